// Copies the attributes of one stream into another.

#include <optional>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "stream/attribute_writer.h"
#include "stream/internal.h"
#include "util/growing_buffer.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_write_to_fd");

// 0, or -1 less the number that failed.
int CopyAttributes(const EASHandle& from, AttributeWriter* to) {
    const unsigned count = DecodeAttributeCount(from.header);
    const off_t file_size = kernel::Lseek(from.fd, 0, SEEK_END);
    GrowingBuffer value;
    int failures = 0;
    for (unsigned i = 0; i < count; ++i) {
        const EASEntry& entry = from.entries[i];
        std::optional<Err> error = value.Fill(from.fd, {entry.offset, entry.length}, file_size);
        if (!error && !to->Write(entry.name, value.data(), entry.length)) error = Err::kWrite;
        if (!error) continue;
        unit.Fail(*error);
        ++failures;
    }
    return failures == 0 ? 0 : -1 - failures;
}

}  // namespace

int EASWriteToFd(int srcFd, int dstFd) {
    if (srcFd < 0 || dstFd < 0) return -1;
    EASHandle* const from = MAVOEASOpen(srcFd, F_RDLCK);
    if (from == nullptr) return -1;
    int result = -1;
    {
        AttributeWriter to(dstFd);
        if (to) result = CopyAttributes(*from, &to);
    }
    const ErrnoKeeper keep;
    (void)MAVOEASClose(from);
    return result;
}

}  // namespace mavoea

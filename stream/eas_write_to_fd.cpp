// Copies the attributes of one stream into another.

#include <optional>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "stream/internal.h"
#include "util/growing_buffer.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_write_to_fd");

int CopyAttributes(const EASHandle& from, EASHandle* to) {
    const unsigned count = DecodeAttributeCount(from.header);
    const off_t file_size = kernel::Lseek(from.fd, 0, SEEK_END);
    GrowingBuffer value;
    int failures = 0;
    for (unsigned i = 0; i < count; ++i) {
        const EASEntry& entry = from.entries[i];
        std::optional<Err> error = value.Fill(from.fd, {entry.offset, entry.length}, file_size);
        if (!error &&
            MAVOEASWrite(to, entry.name, value.data(), entry.length, 0, EAS_WRITE_OVERWRITE) < 0) {
            error = Err::kWrite;
        }
        if (!error) continue;
        unit.Fail(*error);
        ++failures;
    }
    return failures;
}

}  // namespace

int EASWriteToFd(int srcFd, int dstFd) {
    if (srcFd < 0 || dstFd < 0) return -1;
    EASHandle* const from = MAVOEASOpen(srcFd, F_RDLCK);
    if (from == nullptr) return -1;
    EASHandle* const to = MAVOEASOpen(dstFd, F_WRLCK);
    const int failures = to == nullptr ? 0 : CopyAttributes(*from, to);
    const ErrnoKeeper keep;
    if (to != nullptr) (void)MAVOEASClose(to);
    (void)MAVOEASClose(from);
    return to == nullptr || failures != 0 ? -1 - failures : 0;
}

}  // namespace mavoea

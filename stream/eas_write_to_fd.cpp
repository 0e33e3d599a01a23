// Copies the attributes of one stream into another.

#include <utility>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "stream/internal.h"
#include "util/file_io.h"
#include "util/growing_buffer.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_write_to_fd");

// Values one after the other, in a buffer that grows to the longest.
class ValueReader {
 public:
    explicit ValueReader(int fd) : fd_(fd), file_size_(kernel::Lseek(fd, 0, SEEK_END)) {}

    // 0, or -1 after recording why.
    int Read(Range value) {
        // What the file cannot have takes no memory.
        if (value.length != 0 && std::cmp_greater(value.end(), file_size_)) {
            return unit.Fail(Err::kRead);
        }
        if (!buffer_.Reach(value.length)) return unit.Fail(Err::kBufferMemory);
        if (ReadAt(fd_, buffer_.First(value.length), value.offset) != value.length) {
            return unit.Fail(Err::kRead);
        }
        return 0;
    }

    const std::uint8_t* bytes() const { return buffer_.data(); }

 private:
    int fd_;
    off_t file_size_;
    GrowingBuffer buffer_;
};

int CopyAttributes(const EASHandle& from, EASHandle* to) {
    const unsigned count = DecodeAttributeCount(from.header);
    ValueReader values(from.fd);
    int failures = 0;
    for (unsigned i = 0; i < count; ++i) {
        const EASEntry& entry = from.entries[i];
        if (values.Read({entry.offset, entry.length}) != 0) {
            ++failures;
        } else if (MAVOEASWrite(to, entry.name, values.bytes(), entry.length, 0,
                                EAS_WRITE_OVERWRITE) < 0) {
            unit.Fail(Err::kWrite);
            ++failures;
        }
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

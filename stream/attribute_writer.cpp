#include "stream/attribute_writer.h"

#include <fcntl.h>

#include "stream/internal.h"
#include "util/unit.h"

namespace mavoea {

AttributeWriter::AttributeWriter(int fd) : fd_(fd), stream_(MAVOEASOpen(fd, F_WRLCK)) {}

void AttributeWriter::Close() {
    const ErrnoKeeper keep;
    if (stream_ != nullptr) (void)MAVOEASClose(stream_);
    stream_ = nullptr;
}

void AttributeWriter::OpenAnew() {
    EASHandle* const former = stream_;
    stream_ = MAVOEASOpen(fd_, F_WRLCK);
    former->lockType = F_UNLCK;  // to the kernel it is one lock, which is the new one's
    const ErrnoKeeper keep;
    (void)MAVOEASClose(former);
}

bool AttributeWriter::Write(const char* name, const void* value, std::uint32_t size) {
    if (stale_ && stream_ != nullptr) OpenAnew();
    stale_ = stream_ == nullptr ||
             EASReplace(stream_, name, {static_cast<const std::uint8_t*>(value), size}) != 0;
    return !stale_;
}

}  // namespace mavoea

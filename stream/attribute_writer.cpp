#include "stream/attribute_writer.h"

#include <fcntl.h>

#include "util/unit.h"

namespace mavoea {

AttributeWriter::AttributeWriter(int fd) : fd_(fd), stream_(MAVOEASOpen(fd, F_WRLCK)) {}

void AttributeWriter::Close() {
    const ErrnoKeeper keep;
    if (stream_ != nullptr) (void)MAVOEASClose(stream_);
    stream_ = nullptr;
}

bool AttributeWriter::Write(const char* name, const void* value, std::uint32_t size) {
    if (stale_ && stream_ != nullptr) {
        Close();
        const ErrnoKeeper keep;
        stream_ = MAVOEASOpen(fd_, F_WRLCK);
    }
    stale_ =
        stream_ == nullptr || MAVOEASWrite(stream_, name, value, size, 0, EAS_WRITE_OVERWRITE) < 0;
    return !stale_;
}

}  // namespace mavoea

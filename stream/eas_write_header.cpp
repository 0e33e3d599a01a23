// Writes a stream's header and attribute table.

#include "include/mavoea.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_write_header");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASWriteHeader(EASHandle* h) {
    if (h == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    if (h->lockType != F_WRLCK) return unit.Fail(Err::kNotPermitted);
    const StreamHeader header = LoadHeader(*h);
    // Sizes that pass the format's 32 bits are no sizes.
    const Range data = header.attributes.data;
    if (FitTogether(*h, data) == Fit::kNot || !FitsStream(data.end(), 0)) {
        return unit.Fail(Err::kRead);
    }

    StreamImage image(TableEnd(*h));
    if (!image.ok()) return unit.Fail(Err::kMemory);
    image.PutHead(header, h);
    if (image.Write(h->fd, unit) != 0) return -1;
    return kernel::Lseek(h->fd, data.offset, SEEK_SET) < 0 ? unit.Fail(Err::kRead) : 0;
}

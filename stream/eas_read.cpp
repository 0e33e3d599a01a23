// Reads an attribute's value.

#include <algorithm>

#include "include/mavoea.h"
#include "stream/layout.h"
#include "util/file_io.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_read");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASRead(EASHandle* h, const char* name, void* buf, unsigned size, unsigned offset) {
    if (h == nullptr || name == nullptr || buf == nullptr || h->fd < 0) {
        return unit.Fail(Err::kBadArgument);
    }
    if (h->lockType == F_UNLCK) return unit.Fail(Err::kNotPermitted);
    const int index = MAVOEASSearch(h, name);
    if (index < 0) return -1;

    const EASEntry& entry = h->entries[index];
    if (entry.length < offset) return 0;
    const std::uint32_t count = size == 0 ? entry.length : std::min(size, entry.length - offset);
    // More than a result can tell.
    if (!IsValueLength(count)) return unit.Fail(Err::kRead);
    if (size == 0) return static_cast<int>(count);

    const std::int64_t got = ReadAt(h->fd, {static_cast<std::uint8_t*>(buf), count},
                                    std::uint64_t{entry.offset} + offset);
    return got == count ? static_cast<int>(count) : unit.Fail(Err::kRead);
}

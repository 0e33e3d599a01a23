// Frees a handle and releases its lock. The descriptor stays the caller's.

#include "include/mavoea.h"
#include "stream/names.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_close");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASClose(EASHandle* h) {
    if (h == nullptr) return unit.Fail(Err::kBadArgument);
    const int result = h->lockType == F_UNLCK ? 0 : MAVOEASLockSet(h, F_UNLCK);
    FreeStream(h);
    return result;
}

// Asks who holds a lock on a stream.

#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_lock_get");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASLockGet(EASHandle* h, struct flock64* lock) {
    if (h == nullptr || h->fd < 0 || lock == nullptr) return unit.Fail(Err::kBadArgument);
    return kernel::GetLock(h->fd, lock) < 0 ? unit.Fail(Err::kSystemCall) : 0;
}

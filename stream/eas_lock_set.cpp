// Sets and releases a handle's advisory lock.

#include <utility>

#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_lock_set");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASLockSet(EASHandle* h, int lockType) {
    if (h == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    struct flock64 lock = {};  // from 0, of length 0: the whole file, however it grows
    // What is no type at all must not become one by losing its upper half.
    lock.l_type = std::in_range<short>(lockType) ? static_cast<short>(lockType) : short{-1};
    lock.l_whence = SEEK_SET;
    if (kernel::SetLock(h->fd, &lock) < 0) return unit.Fail(Err::kLock);
    h->lockType = lockType;
    return 0;
}

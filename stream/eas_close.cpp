// Frees a handle and releases its lock. The descriptor stays the caller's.

#include "include/mavoea.h"
#include "stream/internal.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_close");

}  // namespace

void FreeTable(EASHandle* h) {
    for (std::int32_t i = 0; i < h->capacity; ++i) kernel::Free(h->entries[i].name);
    kernel::Free(h->entries);
    h->entries = nullptr;
    h->capacity = 0;
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEASClose(EASHandle* h) {
    if (h == nullptr) return unit.Fail(Err::kBadArgument);
    FreeTable(h);
    const int result = h->lockType == F_UNLCK ? 0 : MAVOEASLockSet(h, F_UNLCK);
    kernel::Free(h);
    return result;
}

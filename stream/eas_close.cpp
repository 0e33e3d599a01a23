// Frees a handle and releases its lock. The descriptor stays the caller's.

#include "include/mavoea.h"
#include "stream/open_stream.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_close");

}  // namespace

void FreeEntry(EASHandle* h, EASEntry* entry) {
    const OpenStream* const stream = StreamOf(h);
    const auto name = reinterpret_cast<std::uintptr_t>(entry->name);
    const auto table = reinterpret_cast<std::uintptr_t>(stream->table);
    if (name - table >= stream->table_size) kernel::Free(entry->name);
    *entry = {};
}

void FreeStream(EASHandle* h) {
    for (std::int32_t i = 0; i < h->capacity; ++i) FreeEntry(h, &h->entries[i]);
    kernel::Free(h->entries);
    kernel::Free(StreamOf(h)->table);
    kernel::Free(h);
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEASClose(EASHandle* h) {
    if (h == nullptr) return unit.Fail(Err::kBadArgument);
    const int result = h->lockType == F_UNLCK ? 0 : MAVOEASLockSet(h, F_UNLCK);
    FreeStream(h);
    return result;
}

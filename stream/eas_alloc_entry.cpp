// Makes room in a handle's attribute table.

#include <string.h>

#include <cstdint>
#include <utility>

#include "include/mavoea.h"
#include "stream/large_block.h"
#include "stream/names.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_alloc_entry");

constexpr int kStep = 5;

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASAllocEntry(EASHandle* h, int count) {
    if (h == nullptr || count < 0) return unit.Fail(Err::kBadArgument);
    const int added = count == 0 ? kStep : count;
    const std::int32_t former = h->entries == nullptr ? 0 : h->capacity;
    const std::int64_t capacity = std::int64_t{former} + added;
    if (!std::in_range<std::int32_t>(capacity)) return unit.Fail(Err::kMemory);

    void* const table =
        ResizeBlock(h->entries, static_cast<std::uint64_t>(capacity) * sizeof(EASEntry));
    if (table == nullptr) return unit.Fail(Err::kMemory);
    MoveNameBlock(h->entries, static_cast<EASEntry*>(table));
    h->entries = static_cast<EASEntry*>(table);
    h->capacity = static_cast<std::int32_t>(capacity);
    memset(h->entries + former, 0, static_cast<std::size_t>(added) * sizeof(EASEntry));
    return 0;
}

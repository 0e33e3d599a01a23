#include "stream/names.h"

#include "stream/large_block.h"
#include "util/owned.h"

namespace mavoea {
namespace {

NameBlock* blocks;

bool LiesInBlock(const char* name) {
    const auto at = reinterpret_cast<std::uintptr_t>(name);
    for (NameBlock* block = blocks; block != nullptr; block = block->next) {
        if (at - reinterpret_cast<std::uintptr_t>(block->bytes()) < block->size) return true;
    }
    return false;
}

void FreeName(char* name) {
    if (!LiesInBlock(name)) kernel::Free(name);
}

// The link to the block of `table`, or the one behind the last.
NameBlock** LinkTo(const EASEntry* table) {
    NameBlock** link = &blocks;
    while (*link != nullptr && (*link)->table != table) link = &(*link)->next;
    return link;
}

}  // namespace

NameBlock* ResizeNameBlock(NameBlock* block, std::uint64_t size) {
    auto* const resized = static_cast<NameBlock*>(ResizeBlock(block, sizeof(NameBlock) + size));
    if (resized != nullptr) resized->size = static_cast<std::size_t>(size);
    return resized;
}

void KeepNameBlock(NameBlock* block, const EASEntry* table) {
    block->table = table;
    block->next = blocks;
    blocks = block;
}

void MoveNameBlock(const EASEntry* from, const EASEntry* to) {
    if (NameBlock* const block = *LinkTo(from)) block->table = to;
}

void FreeEntry(EASEntry* entry) {
    FreeName(entry->name);
    *entry = {};
}

void FreeStream(EASHandle* h) {
    for (std::int32_t i = 0; i < h->capacity; ++i) FreeName(h->entries[i].name);
    NameBlock** const link = LinkTo(h->entries);
    if (NameBlock* const block = *link) {
        *link = block->next;
        FreeBlock(block);
    }
    FreeBlock(h->entries);
    kernel::Free(h);
}

}  // namespace mavoea

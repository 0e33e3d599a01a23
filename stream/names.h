// The names in a handle's table. Those of a few attributes have blocks of their own, as callers
// expect who free or replace one. For many, a block each would take longer than all else that
// opening a stream does: they stay where they were read, in one block. Which names lie in such a
// block is known by the block, not by the handle, which may be a copy that a caller has made.
#ifndef MAVOEA_STREAM_NAMES_H_
#define MAVOEA_STREAM_NAMES_H_

#include <cstddef>
#include <cstdint>

#include "include/mavoea.h"

namespace mavoea {

// Of a table of more attributes the names share a block.
inline constexpr std::uint16_t kOwnNamesMax = 32;

struct NameBlock {
    NameBlock* next;        // of all that have a table
    const EASEntry* table;  // freed together with this one; nullptr until it is known
    std::size_t size;       // of the bytes behind this

    std::uint8_t* bytes() { return reinterpret_cast<std::uint8_t*>(this + 1); }
};

// Makes `block` (nullptr: a new one) have room for `size` bytes. nullptr when memory ran out;
// `block` is as it was then.
NameBlock* ResizeNameBlock(NameBlock* block, std::uint64_t size);

// Has `block` go with `table`.
void KeepNameBlock(NameBlock* block, const EASEntry* table);

// The table has moved.
void MoveNameBlock(const EASEntry* from, const EASEntry* to);

// Clears a record, and frees its name unless that lies in a block.
void FreeEntry(EASEntry* entry);

// Frees all records and the handle itself. Its lock stays.
void FreeStream(EASHandle* h);

}  // namespace mavoea

#endif  // MAVOEA_STREAM_NAMES_H_

// What stands behind a handle: the handle itself, and the attribute table as it was read. The names
// of the table's records point into it, so that opening a stream of a thousand attributes takes one
// block and not a thousand.
#ifndef MAVOEA_STREAM_OPEN_STREAM_H_
#define MAVOEA_STREAM_OPEN_STREAM_H_

#include <cstddef>
#include <cstdint>

#include "include/mavoea.h"

namespace mavoea {

struct OpenStream {
    EASHandle handle;  // first: callers have a pointer to it
    std::uint8_t* table;
    std::size_t table_size;
};

inline OpenStream* StreamOf(EASHandle* h) { return reinterpret_cast<OpenStream*>(h); }

// Clears a record, and frees its name unless that lies in the table as read.
void FreeEntry(EASHandle* h, EASEntry* entry);

// Frees all records and the handle itself. Its lock stays.
void FreeStream(EASHandle* h);

}  // namespace mavoea

#endif  // MAVOEA_STREAM_OPEN_STREAM_H_

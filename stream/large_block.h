// Memory for the table and the names of a large stream. Asked for a block of some KiB, the C
// library first tidies up all the small ones that it was given back: behind a list of a thousand
// names that takes longer than all else that opening a stream does. So two such blocks are the
// library's own, enough for a stream of a thousand attributes; whoever comes later has his from the
// C library.
#ifndef MAVOEA_STREAM_LARGE_BLOCK_H_
#define MAVOEA_STREAM_LARGE_BLOCK_H_

#include <cstdint>

namespace mavoea {

// As kernel::Reallocate(): makes `block` (nullptr: a new one) have room for `size` bytes. nullptr
// when memory ran out; `block` is as it was then.
void* ResizeBlock(void* block, std::uint64_t size);

// Gives back what ResizeBlock() has returned, or nullptr.
void FreeBlock(void* block);

}  // namespace mavoea

#endif  // MAVOEA_STREAM_LARGE_BLOCK_H_

#include "stream/large_block.h"

#include <cstddef>
#include <cstring>

#include "platform/kernel.h"

namespace mavoea {
namespace {

// What is smaller the C library gives without tidying up.
constexpr std::uint64_t kSmallestLarge = 1024;

struct OwnBlock {
    alignas(std::max_align_t) std::uint8_t bytes[std::size_t{40} << 10];
    bool taken;
};
OwnBlock own_blocks[2];

OwnBlock* OwnBlockAt(const void* block) {
    for (OwnBlock& own : own_blocks) {
        if (own.bytes == block) return &own;
    }
    return nullptr;
}

OwnBlock* FreeOwnBlock(std::uint64_t size) {
    if (size < kSmallestLarge || size > sizeof OwnBlock::bytes) return nullptr;
    for (OwnBlock& own : own_blocks) {
        if (!own.taken) return &own;
    }
    return nullptr;
}

}  // namespace

void* ResizeBlock(void* block, std::uint64_t size) {
    if (OwnBlock* const own = OwnBlockAt(block)) {
        if (size <= sizeof own->bytes) return block;
        void* const moved = kernel::Allocate(size);
        if (moved == nullptr) return nullptr;
        std::memcpy(moved, own->bytes, sizeof own->bytes);
        own->taken = false;
        return moved;
    }
    OwnBlock* const own = block == nullptr ? FreeOwnBlock(size) : nullptr;
    if (own == nullptr) return kernel::Reallocate(block, size);
    own->taken = true;
    return own->bytes;
}

void FreeBlock(void* block) {
    if (OwnBlock* const own = OwnBlockAt(block)) {
        own->taken = false;
    } else {
        kernel::Free(block);
    }
}

}  // namespace mavoea

// Owners of what must be given back: descriptors, heap blocks, identity. They undo in reverse
// order, and none of them changes errno on the way out.
#ifndef MAVOEA_UTIL_OWNED_H_
#define MAVOEA_UTIL_OWNED_H_

#include <cstddef>
#include <cstdint>
#include <type_traits>
#include <utility>

#include "platform/kernel.h"
#include "util/unit.h"

namespace mavoea {

// Closes a descriptor. Closing any descriptor of a file drops all record locks that the process
// holds on it, so none of these is ever opened on a stream that a handle has locked.
class UniqueFd {
 public:
    explicit UniqueFd(int fd = -1) : fd_(fd) {}
    ~UniqueFd() { Reset(-1); }
    UniqueFd(const UniqueFd&) = delete;
    UniqueFd& operator=(const UniqueFd&) = delete;

    int get() const { return fd_; }
    explicit operator bool() const { return fd_ >= 0; }

    // Closes what it has and takes `fd`.
    void Reset(int fd) {
        const ErrnoKeeper keep;
        if (fd_ >= 0) kernel::Close(fd_);
        fd_ = fd;
    }

 private:
    int fd_;
};

// A heap block of plain records, freed when it goes out of scope. Empty when memory ran out.
template <class T>
class Owned {
    static_assert(std::is_trivially_copyable_v<T> && std::is_trivially_destructible_v<T>);

 public:
    explicit Owned(T* block = nullptr) : block_(block) {}
    ~Owned() { Reset(); }
    Owned(Owned&& other) noexcept : block_(other.Release()) {}
    Owned& operator=(Owned&& other) noexcept {
        T* const taken = other.Release();
        Reset();
        block_ = taken;
        return *this;
    }

    static Owned Allocate(std::uint64_t count) {
        return Owned(static_cast<T*>(kernel::Allocate(count * sizeof(T))));
    }
    static Owned AllocateZeroed(std::uint64_t count) {
        return Owned(static_cast<T*>(kernel::AllocateZeroed(count * sizeof(T))));
    }

    T* get() const { return block_; }
    T* operator->() const { return block_; }
    T& operator*() const { return *block_; }
    explicit operator bool() const { return block_ != nullptr; }
    [[nodiscard]] T* Release() { return std::exchange(block_, nullptr); }

 private:
    void Reset() {
        if (block_ != nullptr) kernel::Free(std::exchange(block_, nullptr));
    }

    T* block_;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_OWNED_H_

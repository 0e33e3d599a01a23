// A buffer for one value after the other, which grows to the longest.
#ifndef MAVOEA_UTIL_GROWING_BUFFER_H_
#define MAVOEA_UTIL_GROWING_BUFFER_H_

#include <cstdint>

#include "util/bytes.h"
#include "util/owned.h"

namespace mavoea {

class GrowingBuffer {
 public:
    GrowingBuffer() { (void)Reach(kSizeAtFirst); }

    bool ok() const { return size_ != 0; }  // false: out of memory

    // Room for `size` bytes at least; what was in it may be lost. False when memory ran out, and
    // there is then no room at all: the old bytes are given back first.
    bool Reach(std::uint32_t size) {
        if (size <= size_) return true;
        bytes_ = Owned<std::uint8_t>();
        bytes_ = Owned<std::uint8_t>::Allocate(size);
        size_ = bytes_ ? size : 0;
        return size_ != 0;
    }

    std::uint8_t* data() const { return bytes_.get(); }
    std::uint32_t size() const { return size_; }
    ByteSpan First(std::uint32_t size) const { return {bytes_.get(), size}; }

 private:
    static constexpr std::uint32_t kSizeAtFirst = 1024;

    Owned<std::uint8_t> bytes_;
    std::uint32_t size_ = 0;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_GROWING_BUFFER_H_

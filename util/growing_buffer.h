// A buffer for one value after the other, which grows to the longest.
#ifndef MAVOEA_UTIL_GROWING_BUFFER_H_
#define MAVOEA_UTIL_GROWING_BUFFER_H_

#include <cstdint>
#include <optional>
#include <utility>

#include "util/bytes.h"
#include "util/file_io.h"
#include "util/owned.h"
#include "util/unit.h"

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

    // The bytes at `from` of the file on fd, which has `file_size` of them (-1, unknown: none), in
    // data(). None, or why not: kRead, also for what the file cannot have, which takes no memory;
    // kBufferMemory.
    std::optional<Err> Fill(int fd, Range from, off_t file_size) {
        if (from.length != 0 && std::cmp_greater(from.end(), file_size)) return Err::kRead;
        if (!Reach(from.length)) return Err::kBufferMemory;
        if (ReadAt(fd, First(from.length), from.offset) != from.length) return Err::kRead;
        return std::nullopt;
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

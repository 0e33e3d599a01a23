// Big-endian bytes: readers that cannot run over, writers, and ranges that cannot wrap.
#ifndef MAVOEA_UTIL_BYTES_H_
#define MAVOEA_UTIL_BYTES_H_

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <span>

namespace mavoea {

using ByteView = std::span<const std::uint8_t>;
using ByteSpan = std::span<std::uint8_t>;

// A stretch of a file. Its end is 64-bit, so that no sum of stored 32-bit fields wraps.
struct Range {
    std::uint32_t offset = 0;
    std::uint32_t length = 0;

    constexpr std::uint64_t end() const { return std::uint64_t{offset} + length; }
    friend constexpr bool operator==(const Range&, const Range&) = default;
};

// Reads big-endian fields one after the other. Past the end it yields zeros and ok() turns false,
// so that a decoder checks once, at its end.
class BeReader {
 public:
    constexpr explicit BeReader(ByteView bytes) : bytes_(bytes) {}

    constexpr std::uint8_t U8() { return static_cast<std::uint8_t>(Take(1)); }
    constexpr std::uint16_t U16() { return static_cast<std::uint16_t>(Take(2)); }
    constexpr std::uint32_t U32() { return Take(4); }

    constexpr void Copy(ByteSpan to) {
        if (!Has(to.size())) {
            std::fill(to.begin(), to.end(), std::uint8_t{0});
            return;
        }
        std::copy_n(bytes_.begin() + static_cast<std::ptrdiff_t>(at_), to.size(), to.begin());
        at_ += to.size();
    }

    constexpr bool ok() const { return ok_; }

 private:
    constexpr bool Has(std::size_t count) {
        ok_ = ok_ && count <= bytes_.size() - at_;
        return ok_;
    }

    constexpr std::uint32_t Take(std::size_t count) {
        if (!Has(count)) return 0;
        std::uint32_t value = 0;
        for (std::size_t i = 0; i < count; ++i) value = value << 8 | bytes_[at_++];
        return value;
    }

    ByteView bytes_;
    std::size_t at_ = 0;
    bool ok_ = true;
};

// Writes big-endian fields one after the other into bytes whose size the caller has seen to: what
// would pass the end is dropped.
class BeWriter {
 public:
    constexpr explicit BeWriter(ByteSpan bytes) : bytes_(bytes) {}

    constexpr void U8(std::uint8_t value) { Put(value, 1); }
    constexpr void U16(std::uint16_t value) { Put(value, 2); }
    constexpr void U32(std::uint32_t value) { Put(value, 4); }

    constexpr void Copy(ByteView from) {
        const std::size_t count = std::min(from.size(), bytes_.size() - at_);
        std::copy_n(from.begin(), count, bytes_.begin() + static_cast<std::ptrdiff_t>(at_));
        at_ += count;
    }

 private:
    constexpr void Put(std::uint32_t value, std::size_t count) {
        if (count > bytes_.size() - at_) return;
        for (std::size_t i = count; i-- > 0;) {
            bytes_[at_++] = static_cast<std::uint8_t>(value >> (8 * i));
        }
    }

    ByteSpan bytes_;
    std::size_t at_ = 0;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_BYTES_H_

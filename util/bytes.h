// Big-endian bytes: readers that cannot run over, writers, and ranges that cannot wrap.
#ifndef MAVOEA_UTIL_BYTES_H_
#define MAVOEA_UTIL_BYTES_H_

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <utility>

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

// memcpy() of a size that compilers are to know nothing of. Where they know the most that it can be
// they copy with string instructions, which take longer to start than a path takes to copy.
inline void CopyBytes(void* to, const void* from, std::size_t size) {
    asm("" : "+r"(size));  // makes the size anybody's guess
    std::memcpy(to, from, size);
}

// The same for sizes that fit in a byte, most of them names': those of 8 to 32 bytes are two copies
// that meet or overlap.
inline void CopyShort(void* to, const void* from, std::size_t size) {
    auto* const end = static_cast<std::uint8_t*>(to) + size;
    const auto* const from_end = static_cast<const std::uint8_t*>(from) + size;
    if (size - 16 <= 16) {
        std::memcpy(to, from, 16);
        std::memcpy(end - 16, from_end - 16, 16);
    } else if (size - 8 <= 8) {
        std::memcpy(to, from, 8);
        std::memcpy(end - 8, from_end - 8, 8);
    } else {
        CopyBytes(to, from, size);
    }
}

// The spelling that compilers know as one load, or one store, and a byte swap.
constexpr std::uint32_t LoadBe32(const std::uint8_t* at) {
    return std::uint32_t{at[0]} << 24 | std::uint32_t{at[1]} << 16 | std::uint32_t{at[2]} << 8 |
           std::uint32_t{at[3]};
}
constexpr std::uint16_t LoadBe16(const std::uint8_t* at) {
    return static_cast<std::uint16_t>(at[0] << 8 | at[1]);
}
constexpr void StoreBe32(std::uint32_t value, std::uint8_t* at) {
    at[0] = static_cast<std::uint8_t>(value >> 24);
    at[1] = static_cast<std::uint8_t>(value >> 16);
    at[2] = static_cast<std::uint8_t>(value >> 8);
    at[3] = static_cast<std::uint8_t>(value);
}
constexpr void StoreBe64(std::uint64_t value, std::uint8_t* at) {
    at[0] = static_cast<std::uint8_t>(value >> 56);
    at[1] = static_cast<std::uint8_t>(value >> 48);
    at[2] = static_cast<std::uint8_t>(value >> 40);
    at[3] = static_cast<std::uint8_t>(value >> 32);
    at[4] = static_cast<std::uint8_t>(value >> 24);
    at[5] = static_cast<std::uint8_t>(value >> 16);
    at[6] = static_cast<std::uint8_t>(value >> 8);
    at[7] = static_cast<std::uint8_t>(value);
}
constexpr void StoreBe16(std::uint16_t value, std::uint8_t* at) {
    at[0] = static_cast<std::uint8_t>(value >> 8);
    at[1] = static_cast<std::uint8_t>(value);
}

// Reads big-endian fields one after the other. Past the end it yields zeros and ok() turns false,
// so that a decoder checks once, at its end.
class BeReader {
 public:
    constexpr explicit BeReader(ByteView bytes) : at_(bytes.data()), left_(bytes.size()) {}

    constexpr std::uint8_t U8() {
        const std::uint8_t* const at = Take(1);
        return at == nullptr ? std::uint8_t{0} : *at;
    }
    constexpr std::uint16_t U16() {
        const std::uint8_t* const at = Take(2);
        return at == nullptr ? std::uint16_t{0} : LoadBe16(at);
    }
    constexpr std::uint32_t U32() {
        const std::uint8_t* const at = Take(4);
        return at == nullptr ? 0 : LoadBe32(at);
    }
    constexpr void Copy(ByteSpan to) {
        const std::uint8_t* const at = Take(to.size());
        if (at == nullptr) {
            std::fill(to.begin(), to.end(), std::uint8_t{0});
        } else {
            std::copy_n(at, to.size(), to.begin());
        }
    }

    constexpr bool ok() const { return ok_; }

 private:
    constexpr const std::uint8_t* Take(std::size_t count) {
        if (!ok_ || count > left_) {
            ok_ = false;
            return nullptr;
        }
        left_ -= count;
        return std::exchange(at_, at_ + count);
    }

    const std::uint8_t* at_;
    std::size_t left_;
    bool ok_ = true;
};

// Writes big-endian fields one after the other into bytes whose size the caller has seen to: what
// would pass the end is dropped.
class BeWriter {
 public:
    constexpr explicit BeWriter(ByteSpan bytes) : at_(bytes.data()), left_(bytes.size()) {}

    constexpr void U8(std::uint8_t value) {
        if (std::uint8_t* const at = Take(1)) *at = value;
    }
    constexpr void U16(std::uint16_t value) {
        if (std::uint8_t* const at = Take(2)) StoreBe16(value, at);
    }
    constexpr void U32(std::uint32_t value) {
        if (std::uint8_t* const at = Take(4)) StoreBe32(value, at);
    }
    constexpr void Copy(ByteView from) {
        if (std::uint8_t* const at = Take(from.size())) {
            std::copy_n(from.begin(), from.size(), at);
        }
    }

 private:
    constexpr std::uint8_t* Take(std::size_t count) {
        if (count > left_) return nullptr;
        left_ -= count;
        return std::exchange(at_, at_ + count);
    }

    std::uint8_t* at_;
    std::size_t left_;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_BYTES_H_

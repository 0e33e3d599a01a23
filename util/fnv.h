// FNV-1a of 64 bits: a hash for names, that is the same on every machine. Whoever chooses the bytes
// can choose the hash as well.
#ifndef MAVOEA_UTIL_FNV_H_
#define MAVOEA_UTIL_FNV_H_

#include <cstdint>
#include <string_view>

namespace mavoea {

class Fnv {
 public:
    constexpr void Add(std::uint8_t byte) { value_ = (value_ ^ byte) * 0x00000100000001B3U; }
    constexpr void Add(std::string_view text) {
        for (const char c : text) Add(static_cast<std::uint8_t>(c));
    }
    // All eight bytes, the lowest first.
    constexpr void AddNumber(std::uint64_t number) {
        for (unsigned shift = 0; shift < 64; shift += 8) {
            Add(static_cast<std::uint8_t>(number >> shift));
        }
    }
    constexpr std::uint64_t value() const { return value_; }

    static constexpr std::uint64_t Of(std::string_view text) {
        Fnv hash;
        hash.Add(text);
        return hash.value();
    }

 private:
    std::uint64_t value_ = 0xCBF29CE484222325U;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_FNV_H_

// Bytes with every damage that can be counted up for short ones.
#ifndef MAVOEA_TESTS_SUPPORT_DAMAGE_H_
#define MAVOEA_TESTS_SUPPORT_DAMAGE_H_

#include <cstddef>
#include <cstdint>
#include <functional>

#include "tests/support/temp_dir.h"

namespace mavoea::test {

// Hands out `whole` cut to each length, its own included, and with each other value of each byte.
// Nothing that belongs to the test lies behind the bytes.
inline void ForEachDamage(const Bytes& whole, const std::function<void(const Bytes&)>& use) {
    for (std::size_t size = 0; size <= whole.size(); ++size) {
        use(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)));
    }
    for (std::size_t at = 0; at < whole.size(); ++at) {
        Bytes damaged = whole;
        for (unsigned value = 0; value < 256; ++value) {
            damaged[at] = static_cast<std::uint8_t>(value);
            if (value != whole[at]) use(damaged);
        }
    }
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_DAMAGE_H_

// The checksum of MacBinary and BinHex: CRC-16 of polynomial 0x1021, from 0, highest bit first.
#ifndef MAVOEA_FORMAT_CRC16_H_
#define MAVOEA_FORMAT_CRC16_H_

#include <array>
#include <cstddef>
#include <cstdint>

#include "util/bytes.h"

namespace mavoea {

constexpr std::array<std::uint16_t, 256> MakeCrc16Table() {
    std::array<std::uint16_t, 256> table{};
    for (unsigned byte = 0; byte < table.size(); ++byte) {
        unsigned crc = byte << 8;
        for (int bit = 0; bit < 8; ++bit) {
            const unsigned high = crc & 0x8000U;
            crc = crc << 1 ^ (high != 0 ? 0x1021U : 0U);
        }
        table[byte] = static_cast<std::uint16_t>(crc);
    }
    return table;
}
inline constexpr std::array<std::uint16_t, 256> kCrc16Table = MakeCrc16Table();

// Of `bytes` behind those whose checksum is `crc`.
constexpr std::uint16_t Crc16(ByteView bytes, std::uint16_t crc = 0) {
    for (const std::uint8_t byte : bytes) {
        crc = static_cast<std::uint16_t>(crc << 8 ^ kCrc16Table[(crc >> 8 ^ byte) & 0xFFU]);
    }
    return crc;
}

static_assert(Crc16(std::array<std::uint8_t, 9>{'1', '2', '3', '4', '5', '6', '7', '8', '9'}) ==
              0x31C3);

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_CRC16_H_

// The flush time of an object on a file-EA volume: when its metadata changed, as an extended
// attribute.
//
//   offset  size  field
//        0     4  seconds since 1970-01-01 UTC, signed, big-endian
#ifndef MAVOEA_FORMAT_FLUSH_TIME_H_
#define MAVOEA_FORMAT_FLUSH_TIME_H_

#include <array>
#include <cstdint>

#include "util/bytes.h"

namespace mavoea {

inline constexpr char kFlushTimeAttribute[] = "user.mavo.filea.flushtime";

// Times that 32 bits cannot tell wrap, as they do for every other reader of the attribute.
constexpr std::array<std::uint8_t, 4> EncodeFlushTime(std::int64_t seconds) {
    std::array<std::uint8_t, 4> bytes{};
    BeWriter(bytes).U32(static_cast<std::uint32_t>(seconds));
    return bytes;
}

static_assert(EncodeFlushTime(0x5F3C2B1A) == std::array<std::uint8_t, 4>{0x5F, 0x3C, 0x2B, 0x1A});

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_FLUSH_TIME_H_

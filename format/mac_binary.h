// MacBinary: a Mac's file as one stream. A header, then data fork, resource fork and comment, each
// padded with zeros to a multiple of 128 bytes. From the MacBinary I, II and III standards; all
// integers are big-endian.
//
//   offset  size  field
//        0     1  0             the version that is meant by the name's place
//        1     1  name size     1 to 63
//        2    63  name          Mac OS Roman, zeros behind it
//       65     8  type and creator
//       73     1  Finder flags, high byte
//       74     1  0
//       75     6  place in its window, vertical and horizontal, and the window or folder
//       81     1  locked        in bit 0
//       82     1  0
//       83     4  data fork's length
//       87     4  resource fork's length
//       91     4  creation      in seconds from 1904-01-01, local time
//       95     4  modification  likewise
//       99     2  comment's length
//      101     1  Finder flags, low byte     since MacBinary II, as what follows
//      102     4  "mBIN"                     MacBinary III
//      106     1  script of the name         MacBinary III
//      107     1  extended Finder flags      MacBinary III
//      108     8  zeros
//      116     4  length unpacked            nothing here packs
//      120     2  length of a second header  behind this one, padded as well
//      122     1  version                    129: II, 130: III
//      123     1  version needed to read it  129
//      124     2  checksum of the first 124 bytes, see crc16.h
//      126     2  zeros
#ifndef MAVOEA_FORMAT_MAC_BINARY_H_
#define MAVOEA_FORMAT_MAC_BINARY_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "format/apple_double.h"

namespace mavoea {

inline constexpr std::size_t kMacBinaryHeadSize = 128;
inline constexpr std::size_t kMacBinaryNameMax = 63;
inline constexpr std::uint32_t kMacBinaryForkMax = 0x7FFFFFFF;

// What a length takes with its padding.
constexpr std::uint64_t MacBinaryPadded(std::uint64_t length) {
    return (length + 127) & ~std::uint64_t{127};
}
static_assert(MacBinaryPadded(0) == 0 && MacBinaryPadded(1) == 128 && MacBinaryPadded(128) == 128);

struct MacBinaryHead {
    std::string_view name;  // in the bytes that were decoded
    // Type, creator, flags, place, script and extended flags are where Finder info has them; the
    // rest is zeros, and is lost where it is not.
    std::array<std::uint8_t, kFinderInfoSize> finder_info{};
    bool locked = false;
    std::uint32_t creation_time = 0;  // both in local time, 0 is none
    std::uint32_t modification_time = 0;
    std::uint32_t data_length = 0;
    std::uint32_t resource_length = 0;
    std::uint16_t comment_length = 0;
};

struct MacBinary {
    int version = 0;  // 1 to 3
    MacBinaryHead head;
    std::uint64_t data_offset = 0;
    std::uint64_t resource_offset = 0;
    std::uint64_t comment_offset = 0;
};

// From a file's first bytes. Nothing marks version 1, so that what has none of its signs is none;
// nor is a file that is too short for what its head tells of, the last padding aside.
std::optional<MacBinary> DecodeMacBinary(ByteView head, std::uint64_t file_size);

// A head of version 3; none of a name or a length that it has no place for.
std::optional<std::array<std::uint8_t, kMacBinaryHeadSize>> EncodeMacBinaryHead(
    const MacBinaryHead& head);

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_MAC_BINARY_H_

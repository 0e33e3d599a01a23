// Netatalk records built byte by byte, without the library.
#ifndef MAVOEA_TESTS_SUPPORT_RECORD_BUILDER_H_
#define MAVOEA_TESTS_SUPPORT_RECORD_BUILDER_H_

#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

// The 402 bytes of an attribute record as netatalk makes it: Finder info first, comment second, a
// Finder info of Pattern(32, 0x40), file dates of 0x11 and an AFP attribute word of 0x0020.
inline Bytes AttributeRecord() {
    return Hex("00 05 16 07  00 02 00 00  00*16  00 08 "
               "00 00 00 09  00 00 00 7A  00 00 00 20 "   // Finder info, 122, 32
               "00 00 00 04  00 00 00 9A  00 00 00 00 "   // comment, 154, 0
               "00 00 00 08  00 00 01 62  00 00 00 10 "   // file dates, 354, 16
               "00 00 00 0E  00 00 01 72  00 00 00 04 "   // AFP file info, 370, 4
               "80 44 45 56  00 00 01 76  00 00 00 00 "   // private device, 374
               "80 49 4E 4F  00 00 01 7E  00 00 00 00 "   // private inode, 382
               "80 53 59 4E  00 00 01 86  00 00 00 00 "   // private sync, 390
               "80 53 56 7E  00 00 01 8E  00 00 00 00 ")  // private id, 398
           + Pattern(32, 0x40) + Repeat(0, 200) + Repeat(0x11, 16) + Hex("00 00 00 20") +
           Repeat(0, 28);
}

// A block of `size` bytes whose only entry has that id, offset and length.
inline Bytes OneEntry(std::uint32_t id, std::uint32_t offset, std::uint32_t length,
                      std::size_t size = 741) {
    Bytes block = Hex("00 05 16 07  00 02 00 00  00*16  00 01  00*12");
    PutU32(block, 26, id);
    PutU32(block, 30, offset);
    PutU32(block, 34, length);
    block.resize(size);
    return block;
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_RECORD_BUILDER_H_

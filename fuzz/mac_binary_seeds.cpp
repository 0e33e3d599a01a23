// Seeds of mac_binary_fuzz: a head of version 3, one of version 1.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteMacBinarySeeds(const std::string& directory) {
    const Bytes begin = Hex(
        "00 0A 'letter.txt' 00*53 'TEXTttxt' 40 00 00 01 00 02 00 03 01 00 00 00 00 11 00 00 00 B4 "
        "B0 00 00 01 B0 00 00 02 00 00");
    WriteFile(directory + "/3",
              begin + Hex("01 'mBIN' 7E 81 00*12 00 00 82 81 0D CC 00 00") + Bytes(384));
    WriteFile(directory + "/1", begin + Bytes(27 + 384));
}

}  // namespace mavoea::fuzz

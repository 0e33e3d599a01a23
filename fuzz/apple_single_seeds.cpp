// Seeds of apple_single_fuzz: a file with three entries, one without any.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteAppleSingleSeeds(const std::string& directory) {
    WriteFile(
        directory + "/three",
        Hex("00 05 16 00 00 02 00 00 00*16 00 03 00 00 00 03 00 00 00 3E 00 00 00 05 00 00 00 09 "
            "00 00 00 43 00 00 00 20 00 00 00 01 00 00 00 63 00 00 00 04 'named' 00*32 'data'"));
    WriteFile(directory + "/none", Hex("00 05 16 00 00 01 00 00 00*18"));
}

}  // namespace mavoea::fuzz

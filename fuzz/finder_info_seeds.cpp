// Seeds of finder_info_fuzz: a file's, and a folder's with a window.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteFinderInfoSeeds(const std::string& directory) {
    WriteFile(directory + "/file", Hex("'TEXTttxt' 40 0C 00 14 FF F0 00 00 00*16"));
    WriteFile(directory + "/folder",
              Hex("00 28 00 3C 01 90 02 58 04 00 00 14 00 64 00 00 00 05 00 06 00*4 80 01 00 00 "
                  "00 00 00 02"));
}

}  // namespace mavoea::fuzz

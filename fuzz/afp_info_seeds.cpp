// Seeds of afp_info_fuzz: a stream with all fields, one without any.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteAfpInfoSeeds(const std::string& directory) {
    WriteFile(directory + "/all",
              Hex("'AFP' 00 00 00 01 00 00*4 2A 3B 4C 5D 'TEXTttxt' 40 00 00*22 00 04 00 00 20 00 "
                  "00*6"));
    WriteFile(directory + "/none", Hex("'AFP' 00 00 00 01 00 00*4 80 00 00 00 00*44"));
}

}  // namespace mavoea::fuzz

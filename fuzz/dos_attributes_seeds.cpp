// Seeds of dos_attributes_fuzz: a value of each version, and the text alone.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteDosAttributesSeeds(const std::string& directory) {
    const Bytes time = Hex("28 DA 02 22 13 79 DD 01");
    const Bytes sizes = Hex("44 33 22 11 08 07 06 05 04 03 02 01 18 17 16 15 14 13 12 11");
    const Bytes attributes = Hex("23 00 00 00");
    const Bytes flags = Hex("11 00 00 00");
    WriteFile(directory + "/text", Hex("'0x22' 00"));
    WriteFile(directory + "/1",
              Hex("'0x23' 00 00 01 00 01 00 00 00") + attributes + sizes + time + time);
    WriteFile(directory + "/2", Hex("'0x23' 00 00 02 00 02 00 00 00") + flags + attributes + sizes +
                                    time + time + time + Hex("'n' 00"));
    WriteFile(directory + "/3",
              Hex("'0x23' 00 00 03 00 03 00 00 00") + flags + attributes + sizes + time + time);
    WriteFile(directory + "/4", Hex("00 00 04 00 04 00 00 00") + flags + attributes + time + time);
    WriteFile(directory + "/5", Hex("00 00 05 00 05 00 00 00") + flags + attributes + time);
    WriteFile(directory + "/5-text", Hex("'0x1' 00 05 00 05 00") + flags + attributes + time);
}

}  // namespace mavoea::fuzz

// Seeds of bin_hex_fuzz: a text with runs, one that is not whole, and a file's bytes.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteBinHexSeeds(const std::string& directory) {
    const Bytes text = Ascii(
        "(This file must be converted with BinHex 4.0)\n"
        ":#QaPG(4PFLjdH(3!9%9B9(4dH(4!!3!!!6J!!!!)CJ*NBA4KN!#3\"3#3r`#3,@9\n"
        "ZC!'@G'KP)'C[FQ[aR!:\n");
    WriteFile(directory + "/whole", text);
    WriteFile(directory + "/half", Bytes(text.begin(), text.begin() + 90));
    WriteFile(directory + "/file", Hex("'data' 90*5 00*300 'end'"));
}

}  // namespace mavoea::fuzz

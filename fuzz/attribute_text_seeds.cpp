// Seeds of attribute_text_fuzz: texts of getfattr, and one that is none.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteAttributeTextSeeds(const std::string& directory) {
    WriteFile(directory + "/text", Ascii("# file: a\nuser.a=\"b\\\"\\\\\\012\"\nuser.b\n\n"));
    WriteFile(directory + "/hex", Ascii("# file: a\\134b\nuser.a\\075b=0x00fF\n\n"));
    WriteFile(directory + "/base64", Ascii("# file: a\nuser.a=0sAAEC\nuser.b=0sAA==\n\n"));
    WriteFile(directory + "/bare", Ascii("#\nuser.a=b\\1\r\nuser.b=\"\\400\"\n"));
}

}  // namespace mavoea::fuzz

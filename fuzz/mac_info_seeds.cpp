// Seeds of mac_info_fuzz: property lists of each kind, binary and as XML, and quarantine.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteMacInfoSeeds(const std::string& directory) {
    // A text; an array of two of them: header, objects, offsets, trailer.
    const Bytes text = Hex("'bplist00' 55 'hello' 08 00*5 00 01 01 00*7 01 00*7 00 00*7 0E");
    const Bytes texts = Hex(
        "'bplist00' A2 01 02 53 'red' 54 'blue' 08 0B 0F 00*5 00 01 01 00*7 03 00*7 00 00*7 14");
    const Bytes xml = Ascii(
        "<?xml version=\"1.0\"?><plist version=\"1.0\"><dict><key>a</key><date>2001-02-03T04:05:06Z"
        "</date><key>b</key><data>AAEC</data><key>c</key><integer>-7</integer><key>d</key><real>1.5"
        "</real><key>e</key><true/></dict></plist>");
    const Bytes quarantine = Ascii("0083;5f5e1000;Browser;12345678-9ABC");
    for (std::uint8_t kind = 0; kind < 4; ++kind) {
        const std::string name = directory + '/' + std::to_string(kind);
        WriteFile(name + "-text", Bytes{kind} + text);
        WriteFile(name + "-texts", Bytes{kind} + texts);
        WriteFile(name + "-xml", Bytes{kind} + xml);
    }
    WriteFile(directory + "/quarantine", Bytes{4} + quarantine);
}

}  // namespace mavoea::fuzz

// Objects of foreign_object_fuzz: what each program keeps of one, in each dialect.

#include "fuzz/foreign_names.h"
#include "fuzz/seeds.h"
#include "tests/support/record_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {
namespace {

using namespace mavoea::test;

Bytes Attribute(std::string_view name, const Bytes& value) {
    return Bytes{ForeignName(name), static_cast<std::uint8_t>(value.size() >> 8),
                 static_cast<std::uint8_t>(value.size())} +
           value;
}

}  // namespace

void WriteForeignObjectSeeds(const std::string& directory) {
    const Bytes record = Attribute("user.org.netatalk.Metadata", AttributeRecord());
    const Bytes afp_info =
        Attribute("user.DosStream.AFP_AfpInfo:$DATA",
                  Hex("'AFP' 00 00 00 01 00 00*4 2A 3B 4C 5D 'TEXTttxt' 40 00 00*22 00 04 00 00 20 "
                      "00 00*6 00"));
    const Bytes fork = Attribute("user.DosStream.AFP_Resource:$DATA", Pattern(100) + Bytes{0});
    const Bytes stream = Attribute("user.DosStream.colour:$DATA", Ascii("blue") + Bytes{0});
    const Bytes extent = Attribute("user.DosStreamExt.1.colour:$DATA", Ascii("green"));
    const Bytes plain = Attribute("user.colour", Ascii("red"));
    const Bytes info = Attribute("user.com.apple.FinderInfo", Pattern(32, 7));
    const Bytes marks =
        Attribute("user.DOSATTRIB",
                  Hex("00 00 05 00 05 00 00 00 11 00 00 00 23 00 00 00 28 DA 02 22 13 79 DD 01"));
    for (std::uint8_t dialect = 0; dialect < 7; ++dialect) {
        const std::string name = directory + '/' + std::to_string(dialect);
        WriteFile(name + "-record", Bytes{dialect} + record + marks + stream);
        WriteFile(name + "-streams", Bytes{dialect} + afp_info + fork + stream + extent + marks);
        WriteFile(name + "-plain", Bytes{dialect} + info + plain + stream);
    }
}

}  // namespace mavoea::fuzz

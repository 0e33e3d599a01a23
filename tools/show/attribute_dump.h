// What other programs keep of an object in its extended attributes, field by field.
#ifndef MAVOEA_TOOLS_SHOW_ATTRIBUTE_DUMP_H_
#define MAVOEA_TOOLS_SHOW_ATTRIBUTE_DUMP_H_

#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/json.h"

namespace mavoea::tool {

struct AttributeDump {
    std::string text;
    Json json;
    std::size_t violations = 0;
};

// One for each attribute, sorted by name: Samba's DOS attributes and streams, netatalk's record,
// and those that users have. Throws Failure where they cannot be read.
std::vector<AttributeDump> DumpAttributes(const Object& object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_ATTRIBUTE_DUMP_H_

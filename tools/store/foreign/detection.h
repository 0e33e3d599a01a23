// Whose metadata lies in a directory of which nobody has said.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_DETECTION_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_DETECTION_H_

#include <optional>
#include <string>
#include <vector>

#include "tools/place/volume.h"

namespace mavoea::tool {

// What an attribute tells of the program that has made it.
struct Sign {
    const Dialect* dialect;
    std::string text;  // "user.DosStream.*"
};

// By the attributes of one object.
std::optional<Sign> SignIn(const std::vector<std::string>& attributes);

// By those of the object, if it is there.
std::optional<Sign> SignOf(const Place& place);
// The same, or by those of its directory and of some that are in it.
std::optional<Sign> FindSign(const Place& place);

// Failure where another program keeps metadata and nobody has said that it does: it would not see
// what is written.
void RequireDeclared(const Object& object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_DETECTION_H_

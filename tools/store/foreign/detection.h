// Whose metadata lies in a directory of which nobody has said.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_DETECTION_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_DETECTION_H_

#include <optional>
#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/messages.h"

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

// Where Samba keeps the streams of an object as files of a directory of their own, streams_depot,
// which is not read here: that directory, or the attribute that it gives to whoever has some. Empty
// where nothing is known of one. `inode`: the object's, null while there is none; `attributes`: the
// names of its own. Where somebody has declared a type that is not Samba's nobody looks.
std::string FindDepot(const Object& object, const Inode* inode,
                      const std::vector<std::string>& attributes);
Failure DepotIsUnknown(const Object& object, const std::string& depot);

// Failure where another program keeps metadata and nobody has said that it does, or in a way that
// is not known: it would not see what is written.
void RequireDeclared(const Object& object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_DETECTION_H_

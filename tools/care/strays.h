// Files of metadata that nobody reads, since another place counts: what of them is nowhere else is
// put into that.
#ifndef MAVOEA_TOOLS_CARE_STRAYS_H_
#define MAVOEA_TOOLS_CARE_STRAYS_H_

#include <string>

#include "tools/place/volume.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// Puts what the file of that path holds, and the object has not, into the object's place. False
// when there is no such file. Failure, and nothing has changed, where the object has something
// else, or the file cannot be read to its end.
bool AdoptStray(const Object& object, const std::string& path);

// Removes the file, if the object has all that it holds. Throws Failure.
void RemoveStray(const Object& object, const std::string& path);

// Failure when the object has not all of that.
void RequireAllOf(const Object& object, Metadata wanted);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_STRAYS_H_

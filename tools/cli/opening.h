// Opening an object for a change.
#ifndef MAVOEA_TOOLS_CLI_OPENING_H_
#define MAVOEA_TOOLS_CLI_OPENING_H_

#include <memory>

#include "tools/place/volume.h"
#include "tools/store/change.h"

namespace mavoea::tool {

// What an earlier version kept comes along, and is told; what others began there is brought to its
// end. Throws Failure.
std::unique_ptr<Changer> OpenToChange(const Object& object);

// Removes one; false when there was none.
bool RemoveFrom(const Object& object, const std::string& name);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CLI_OPENING_H_

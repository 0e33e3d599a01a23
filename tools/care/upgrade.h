// mavoea upgrade: what earlier versions kept for an object, into the current layout.
#ifndef MAVOEA_TOOLS_CARE_UPGRADE_H_
#define MAVOEA_TOOLS_CARE_UPGRADE_H_

#include "tools/walk/tree.h"

namespace mavoea::tool {

ExitStatus Upgrade(const TreeOptions& options);

// Failure for volumes that keep no EA directory, and for the root.
void RequireEaDirectory(const Object& object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_UPGRADE_H_

// mavoea repair: attributes that a resource file wrongly holds, into the EA stream.
#ifndef MAVOEA_TOOLS_CARE_REPAIR_H_
#define MAVOEA_TOOLS_CARE_REPAIR_H_

#include "tools/walk/tree.h"

namespace mavoea::tool {

ExitStatus Repair(const TreeOptions& options);

// The same for one object. Throws Failure.
Outcome RepairObject(const Object& volume_object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_REPAIR_H_

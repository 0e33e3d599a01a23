// mavoea lock, mavoea unlock: whether Macs may write, rename and delete objects.
#ifndef MAVOEA_TOOLS_CARE_LOCK_H_
#define MAVOEA_TOOLS_CARE_LOCK_H_

#include "tools/say/messages.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {

// Goes on after a failure. kSuccess when all objects are in that state.
ExitStatus Lock(const TreeOptions& options, bool locked);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_LOCK_H_

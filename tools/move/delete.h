// mavoea rm: objects, and their metadata with them.
#ifndef MAVOEA_TOOLS_MOVE_DELETE_H_
#define MAVOEA_TOOLS_MOVE_DELETE_H_

#include "tools/move/options.h"

namespace mavoea::tool {

ExitStatus Delete(const RemoveOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_DELETE_H_

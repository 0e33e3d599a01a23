// mavoea cp and mavoea mv: objects, and their metadata with them.
#ifndef MAVOEA_TOOLS_MOVE_COPY_H_
#define MAVOEA_TOOLS_MOVE_COPY_H_

#include "tools/move/options.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

ExitStatus Copy(const CopyOptions& options);
ExitStatus Move(const CopyOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_COPY_H_

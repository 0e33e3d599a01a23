// mavoea where: the volume's type, and every place where metadata may lie.
#ifndef MAVOEA_TOOLS_SHOW_WHERE_H_
#define MAVOEA_TOOLS_SHOW_WHERE_H_

#include <string>

#include "tools/say/messages.h"

namespace mavoea::tool {

ExitStatus Where(const std::string& path, bool json);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_WHERE_H_

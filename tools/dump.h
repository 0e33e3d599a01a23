// Every field of a metadata file, and what is wrong with them.
#ifndef MAVOEA_TOOLS_DUMP_H_
#define MAVOEA_TOOLS_DUMP_H_

#include <string>

#include "tools/layout.h"

namespace mavoea::tool {

std::string DumpText(const std::string& path, const Layout& layout, const Findings& findings);
Json DumpJson(const std::string& path, const Layout& layout, const Findings& findings);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_DUMP_H_

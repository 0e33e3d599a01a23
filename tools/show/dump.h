// Every field of a metadata file, and what is wrong with them.
#ifndef MAVOEA_TOOLS_SHOW_DUMP_H_
#define MAVOEA_TOOLS_SHOW_DUMP_H_

#include <string>

#include "tools/say/json.h"
#include "tools/store/layout.h"

namespace mavoea::tool {

// `kind` says what it is; null: what its layout says.
std::string DumpText(const std::string& path, const Layout& layout, const Findings& findings,
                     const char* kind = nullptr);
Json DumpJson(const std::string& path, const Layout& layout, const Findings& findings,
              const char* kind = nullptr);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_DUMP_H_

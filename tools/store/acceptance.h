// Which AppleDouble files other programs read. What they do not read they ignore, and say nothing.
#ifndef MAVOEA_TOOLS_STORE_ACCEPTANCE_H_
#define MAVOEA_TOOLS_STORE_ACCEPTANCE_H_

#include <optional>
#include <string>

#include "tools/store/layout.h"

namespace mavoea::tool {

// Why smbd, or a Mac, does not read a "._" file, in words; none when it does.
std::optional<std::string> WhySmbdIgnores(const Layout& file);
std::optional<std::string> WhyMacIgnores(const Layout& file);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_ACCEPTANCE_H_

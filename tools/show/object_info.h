// mavoea show: what is known of an object, decoded. Nothing changes by it.
#ifndef MAVOEA_TOOLS_SHOW_OBJECT_INFO_H_
#define MAVOEA_TOOLS_SHOW_OBJECT_INFO_H_

#include <string>
#include <vector>

#include "tools/say/messages.h"

namespace mavoea::tool {

struct ShowOptions {
    std::vector<std::string> paths;
    bool recursive = false;
    bool json = false;
};

// In recursive work, objects that have nothing are left out. What cannot be decoded is shown by its
// size, with the reason; that is no failure.
ExitStatus Show(const ShowOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_OBJECT_INFO_H_

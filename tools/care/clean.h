// mavoea clean: metadata whose object is gone.
#ifndef MAVOEA_TOOLS_CARE_CLEAN_H_
#define MAVOEA_TOOLS_CARE_CLEAN_H_

#include "tools/place/paths.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

struct CleanOptions {
    NamedPaths directories;
    bool recursive = false;
    bool remove = false;  // only listed otherwise
    bool others = false;  // what other services left as well
    int wait = 2;         // seconds between the two looks before something is removed
    bool json = false;
};

// Goes on after a failure: kSuccess when nothing failed, otherwise the gravest status. When it is
// interrupted, 128 and the number of the signal; what has not been removed by then stays.
ExitStatus Clean(const CleanOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_CLEAN_H_

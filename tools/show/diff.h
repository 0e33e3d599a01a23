// mavoea diff: what of two objects or trees is not the same.
#ifndef MAVOEA_TOOLS_SHOW_DIFF_H_
#define MAVOEA_TOOLS_SHOW_DIFF_H_

#include <string>

#include "tools/say/messages.h"
#include "tools/walk/crew.h"

namespace mavoea::tool {

struct DiffOptions {
    std::string first;
    std::string second;
    bool recursive = false;
    CrewSize crew = {};
    bool data = false;  // what is in files, too
    bool brief = false;
    bool itemized = false;
    bool json = false;  // an object a line
};

// kSuccess: equal; 1: different; kFailed: something could not be looked at, whatever else was
// found; 128 and the signal's number when interrupted.
ExitStatus Diff(const DiffOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_DIFF_H_

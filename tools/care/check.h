// mavoea check: whether all that is known of objects is sound.
#ifndef MAVOEA_TOOLS_CARE_CHECK_H_
#define MAVOEA_TOOLS_CARE_CHECK_H_

#include "tools/say/messages.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {

struct CheckOptions {
    TreeOptions tree;      // JSON is an object a line
    bool verbose = false;  // says at the end how many there were
    bool repair = false;   // mends what can be mended without loss
    bool remove = false;   // of that: what was replaced is not kept any longer
};

// Reads all of it and changes nothing, unless it is to repair. A line for each finding, as it is
// found. 0: there is none, or all have been mended; 1: there are; 2: something could not be looked
// at.
ExitStatus CheckSoundness(const CheckOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_CHECK_H_

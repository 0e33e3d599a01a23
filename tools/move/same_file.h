// Whether a copy would destroy what it is made from.
#ifndef MAVOEA_TOOLS_MOVE_SAME_FILE_H_
#define MAVOEA_TOOLS_MOVE_SAME_FILE_H_

#include "tools/move/ends.h"
#include "tools/move/options.h"

namespace mavoea::tool {

enum class Task { kCopy, kMove };

enum class Sameness {
    kApart,    // the copy can be made
    kSame,     // it would be lost
    kNothing,  // there is nothing to do
};

Sameness CompareEnds(const Source& source, const Target& target, Task task,
                     const CopyOptions& options, bool follows);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_SAME_FILE_H_

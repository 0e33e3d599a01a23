// Work on many objects: those that were named and, in recursive work, all below them.
#ifndef MAVOEA_TOOLS_TREE_H_
#define MAVOEA_TOOLS_TREE_H_

#include <functional>
#include <string>
#include <vector>

#include "tools/messages.h"
#include "tools/volume.h"

namespace mavoea::tool {

// What became of an object.
enum class Outcome { kDone, kCurrent, kNothing };

// What people should know of an object with which nothing is wrong.
using Notes = std::vector<std::string>;

struct Task {
    // In the progress line and the summary: "upgrading", "converted", "already current", "nothing
    // to convert". Null where an outcome cannot be.
    const char* doing;
    const char* done;
    const char* current;
    const char* nothing;

    // Throws Failure for an object on a volume that does not suit. Nothing below such a directory
    // is looked at.
    std::function<void(const Object&)> check;
    // Throws Failure.
    std::function<Outcome(const Object&, Notes*)> work;
};

struct TreeOptions {
    std::vector<std::string> paths;
    bool recursive = false;
    bool json = false;
};

// Does the task to one object after the other, and goes on after a failure. Directories are objects
// as well. Below a directory, symbolic links are left out, and so are EA directories and what else
// holds metadata: hidden directories, names with a ':', "._" files.
//
// Shows how far it is on standard error, when that is a terminal; at the end the counts are on
// standard output, and notes and failures on standard error. kSuccess when nothing failed,
// otherwise the gravest status.
ExitStatus RunOnTree(const TreeOptions& options, const Task& task);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TREE_H_

// cp --parents: the directories of a source's path, made below the destination.
#ifndef MAVOEA_TOOLS_MOVE_PARENTS_H_
#define MAVOEA_TOOLS_MOVE_PARENTS_H_

#include <string>
#include <vector>

#include "tools/transfer/transfer.h"

namespace mavoea::tool {

// Both throw Failure.
class Parents {
 public:
    // Makes those of `source` that are not there. Returns where the source itself is to go.
    Place Make(Transfer* transfer, const std::string& source, const DirectoryRef& below);

    // Gives what Make() made its attributes and metadata, now that something is in it.
    void Finish(Transfer* transfer);

 private:
    struct Parent {
        Place from;
        Place to;
        DirectoryRef made;
        bool is_new;
    };
    std::vector<Parent> parents_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_PARENTS_H_

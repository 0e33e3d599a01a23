// What may be amiss with all that is known of one object.
#ifndef MAVOEA_TOOLS_CARE_CHECK_OBJECT_H_
#define MAVOEA_TOOLS_CARE_CHECK_OBJECT_H_

#include <optional>

#include "tools/care/finding.h"
#include "tools/place/volume.h"

namespace mavoea::tool {

// What is to be told once for all objects of a directory, one of which follows another.
class OncePerDirectory {
 public:
    // Whether this is the first time for the directory.
    bool IsFirst(const Directory& directory);

 private:
    std::optional<struct stat> last_;
};

class ObjectCheck {
 public:
    explicit ObjectCheck(FindingSink* sink) : sink_(*sink) {}

    // Throws Failure where nothing can be looked at.
    void Run(const Object& object);

 private:
    FindingSink& sink_;
    OncePerDirectory undeclared_;
    OncePerDirectory ea_directory_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_CHECK_OBJECT_H_

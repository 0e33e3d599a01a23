// Metadata whose object is gone.
#ifndef MAVOEA_TOOLS_CARE_DANGLING_H_
#define MAVOEA_TOOLS_CARE_DANGLING_H_

#include <string>
#include <vector>

#include "tools/place/directory.h"

namespace mavoea::tool {

enum class DanglingKind {
    kAppleDouble,
    kStream,
    kResource,
    kResourceCopy,
    kLegacyFolder,
    kOther,        // something of another service, which may know better
    kEaDirectory,  // with nothing in it but what is on the list before it, and ".cover"
};

struct Dangling {
    DanglingKind kind;
    std::string name;     // in the EA directory, but for AppleDouble files and the EA directory
    const char* because;  // for people

    bool InEaDirectory() const {
        return kind != DanglingKind::kAppleDouble && kind != DanglingKind::kEaDirectory;
    }
};

// "stream", for programs, and "EA stream", for people.
const char* IdOf(DanglingKind kind);
const char* LabelOf(DanglingKind kind);

// What dangles in a directory and its EA directory, in the order in which it can be removed. The EA
// directory itself is listed where nothing stays in it: with `others`, which says that things of
// kind kOther go as well, that may be more often. Everything that any object in the directory may
// own is left out; what was made meanwhile as well. `ea_dir` is null where there is none. Throws
// Failure.
std::vector<Dangling> FindDangling(const DirectoryRef& directory, const DirectoryRef& ea_dir,
                                   bool others);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_DANGLING_H_

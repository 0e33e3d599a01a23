// Metadata whose object is gone.
#ifndef MAVOEA_TOOLS_CARE_DANGLING_H_
#define MAVOEA_TOOLS_CARE_DANGLING_H_

#include <string>
#include <vector>

#include "tools/place/directory.h"

namespace mavoea::tool {

enum class DanglingKind {
    kTemporary,  // a file that a run was making when it was killed
    kPending,    // a rename that was cut short, see tools/transfer/pending.h
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
    DirectoryRef holder;  // the directory or its EA directory
    std::string name;     // in it
    const char* because;  // for people
    struct stat info;     // when it was found
};

// "stream", for programs, and "EA stream", for people.
const char* IdOf(DanglingKind kind);
const char* LabelOf(DanglingKind kind);

// What dangles in a directory and its EA directory, in the order in which it can be removed. The EA
// directory itself is listed where nothing stays in it: with `others`, which says that things of
// kind kOther go as well, that may be more often. Everything that any object in the directory may
// own is left out; what was made meanwhile as well, and what processes work with that are alive.
// `ea_dir` is null where there is none. Throws Failure.
std::vector<Dangling> FindDangling(const DirectoryRef& directory, const DirectoryRef& ea_dir,
                                   bool others);

// Whether an object has come for a thing that dangled, wherever that is now.
bool HasObject(const Directory& directory, const Dangling& dangling);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_DANGLING_H_

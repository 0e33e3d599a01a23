// What may be amiss in a directory beside its objects: what belongs to none of them, what runs that
// were cut short have left, and names that become the same.
#ifndef MAVOEA_TOOLS_CARE_CHECK_DIRECTORY_H_
#define MAVOEA_TOOLS_CARE_CHECK_DIRECTORY_H_

#include <string>

#include "tools/care/finding.h"
#include "tools/place/volume.h"

namespace mavoea::tool {

// Throws Failure.
void CheckDirectory(const DirectoryRef& directory, FindingSink* sink);

// The finding of an object whose metadata would have the names of another's.
Finding SharedNames(const Place& object, const std::string& other);

// Whether what has that name is no object, but this tool's own for a time.
bool IsOfTool(const Directory::Entry& entry);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_CHECK_DIRECTORY_H_

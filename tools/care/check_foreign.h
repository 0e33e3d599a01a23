// What may be amiss with what other programs keep of an object: their attributes, and "._" files
// that they would not read.
#ifndef MAVOEA_TOOLS_CARE_CHECK_FOREIGN_H_
#define MAVOEA_TOOLS_CARE_CHECK_FOREIGN_H_

#include <string>
#include <vector>

#include "tools/care/finding.h"
#include "tools/place/volume.h"

namespace mavoea::tool {

// `program` keeps the object's metadata, null: the platform does; `names`: of its attributes.
// Whether any is damaged. Throws Failure.
bool CheckAttributes(const Object& object, const Dialect* program, const Inode& inode,
                     const std::vector<std::string>& names, FindingSink* sink);

// A "._" file of the object at `path`. Throws Failure.
void CheckAcceptance(const Dialect* program, const std::string& path, const File& file,
                     const Layout& layout, FindingSink* sink);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_CHECK_FOREIGN_H_

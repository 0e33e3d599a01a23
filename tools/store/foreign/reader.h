// Reading what Samba, netatalk and others have kept of an object.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_READER_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_READER_H_

#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/metadata.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {

// All of it, in whatever spelling; the dialect's own counts. Marks are left to ReadMarks().
// `attributes`: the names of the object's own.
Metadata ReadForeign(const Dialect& dialect, const Inode& inode,
                     const std::vector<std::string>& attributes, const Sidecars& sidecars);

// Adds what attributes hold: of whatever name, or of names that no other program would have given.
// `attributes`: the names of those of `source`.
enum class Certainty { kAny, kCertain };
void AddForeignAttributes(const Dialect& dialect, const AttributeSource& source,
                          const std::vector<std::string>& attributes, Certainty certainty,
                          Metadata* metadata);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_READER_H_

// What a repair has replaced, in files beside those that have taken their place: "NAME@MavoEAKept"
// and "NAME@MavoResKept" in the EA directory, which go where the object goes as other services'
// files do, and ".mavoea-kept-._NAME" beside a "._" file.
#ifndef MAVOEA_TOOLS_CARE_KEPT_H_
#define MAVOEA_TOOLS_CARE_KEPT_H_

#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/rights.h"

namespace mavoea::tool {

enum class KeptOf { kStream, kResource, kAppleDouble };

// Where the old one of that file is kept.
std::string KeptName(const std::string& object_name, KeptOf which);
bool IsKeptName(const std::string& name);

// Those of an object that are there, links and the like too.
std::vector<Place> FindKept(const Object& object);
// Those beside "._" files of objects that are gone.
std::vector<Place> FindKeptOfNobody(const DirectoryRef& directory);

// Gives the bytes of `file`, which is locked, a name of their own; they have been read back and are
// on disk when this returns. Where they are kept already nothing is done. Failure where something
// else is in the way. Returns the path.
std::string Keep(const File& file, const Place& kept, const Rights& rights);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_KEPT_H_

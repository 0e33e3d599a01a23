// Changing one thing that Samba, netatalk and others keep of an object.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_CHANGER_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_CHANGER_H_

#include <memory>

#include "tools/place/volume.h"
#include "tools/store/change.h"

namespace mavoea::tool {

// For an object on a volume of the dialect. Throws Failure.
std::unique_ptr<Changer> OpenForeignChanger(const Object& object, const Dialect& dialect);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_CHANGER_H_

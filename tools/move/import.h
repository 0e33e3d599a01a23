// mavoea import: what a "._" file holds, onto an object.
#ifndef MAVOEA_TOOLS_MOVE_IMPORT_H_
#define MAVOEA_TOOLS_MOVE_IMPORT_H_

#include <string>

#include "tools/say/messages.h"

namespace mavoea::tool {

// Everything is read before anything is written; values replace those of the same name, and what
// the file does not hold stays on the object. A part that cannot be stored does not keep the others
// from it.
ExitStatus Import(const std::string& apple_double, const std::string& path, bool json);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_IMPORT_H_

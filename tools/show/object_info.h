// mavoea show: what is known of an object, decoded. Nothing changes by it.
#ifndef MAVOEA_TOOLS_SHOW_OBJECT_INFO_H_
#define MAVOEA_TOOLS_SHOW_OBJECT_INFO_H_

#include "tools/say/messages.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {

// JSON is a line for each object. In recursive work, text leaves out objects that have nothing.
// What cannot be decoded is shown by its size, with the reason; that is no failure.
ExitStatus Show(const TreeOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_OBJECT_INFO_H_

// An object gets another name on its volume, and all that lies beside it with it.
#ifndef MAVOEA_TOOLS_TRANSFER_RENAME_H_
#define MAVOEA_TOOLS_TRANSFER_RENAME_H_

#include "tools/place/directory.h"

namespace mavoea::tool {

// Over what is there, whose metadata goes. False when that takes a copy, because the two are on
// different file systems or kinds of volumes; nothing has changed then. Throws Failure; the object
// is then where it was with all of its metadata, unless something stood in its new place.
//
// A run that is killed on the way leaves what the next one, or `mavoea clean`, brings to its end:
// see pending.h.
bool RenameObject(const Place& from, const Place& to);

// Brings such a rename to its end when the object has its new name already, and its old one is not
// there any more. False when there is none. Throws Failure.
bool FinishRename(const Place& from, const Place& to);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_RENAME_H_

// Reading what is known of an object, from each kind of place. Nothing on disk changes by it, no
// earlier layout is converted, and access times stay where the process may have that.
#ifndef MAVOEA_TOOLS_STORE_READER_H_
#define MAVOEA_TOOLS_STORE_READER_H_

#include "tools/store/metadata.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {

// Through the reader of the object's volume. What cannot be looked at is among the problems; a
// Failure is thrown where nothing can. An object on a volume that keeps nothing has nothing.
Metadata ReadMetadata(const Object& object, Sidecars::Services services);
Metadata ReadMetadata(const Object& object, const Sidecars& sidecars);
// The same for who has it open.
Metadata ReadMetadata(const Object& object, const Inode& inode, const Sidecars& sidecars);

// What an AppleDouble file holds that an object can be given. Throws Failure when it is none of
// version 2, and for what is damaged in it.
Metadata ReadAppleDoubleFile(std::shared_ptr<const File> file);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_READER_H_

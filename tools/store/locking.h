// The library's lock on a whole metadata file.
#ifndef MAVOEA_TOOLS_STORE_LOCKING_H_
#define MAVOEA_TOOLS_STORE_LOCKING_H_

#include "tools/place/file.h"

namespace mavoea::tool {

enum class Access { kRead, kWrite };

// Takes it until the file is closed. Another process in the way is a Failure.
void LockFile(const File& file, Access access);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_LOCKING_H_

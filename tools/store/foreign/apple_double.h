// "._" files as Samba and netatalk have them: a resource fork, and a place for Finder info that is
// kept elsewhere.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_APPLE_DOUBLE_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_APPLE_DOUBLE_H_

#include "tools/place/file.h"
#include "tools/store/encoding.h"

namespace mavoea::tool {

// Whether a Mac has written it: Samba then believes its Finder info.
bool IsMacs(const File& file);

// The head of a file with a fork of that size, and the whole one.
Bytes EncodeForkHead(std::uint32_t fork_size);
Pieces EncodeForkFile(const Content& fork);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_APPLE_DOUBLE_H_

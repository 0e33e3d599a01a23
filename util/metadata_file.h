// Metadata files, in folders where everybody may put something else in their place. They are opened
// with kernel::OpenRegular(); here is what else is done with them without following a link.
#ifndef MAVOEA_UTIL_METADATA_FILE_H_
#define MAVOEA_UTIL_METADATA_FILE_H_

#include "platform/kernel.h"

namespace mavoea {

// Gives the metadata file `mode`, through a descriptor. Best effort: others may own the file.
void SetMetadataMode(const char* path, mode_t mode);

// Whether `path` may be handed to a program that copies or moves metadata: it is a regular file, or
// missing. Otherwise false, with errno as kernel::OpenRegular() sets it.
bool IsMetadataOrMissing(const char* path);

// The same of both ends of a copy.
inline bool AreMetadataOrMissing(const char* from, const char* to) {
    return IsMetadataOrMissing(from) && IsMetadataOrMissing(to);
}

}  // namespace mavoea

#endif  // MAVOEA_UTIL_METADATA_FILE_H_

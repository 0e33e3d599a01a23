// Metadata files, in folders where everybody may put something else in their place. They are opened
// with kernel::OpenRegular(); here is what else is done with them without following a link.
#ifndef MAVOEA_UTIL_METADATA_FILE_H_
#define MAVOEA_UTIL_METADATA_FILE_H_

#include "platform/kernel.h"

namespace mavoea {

// How often a file is opened, or made, that is replaced before it is locked; then it is given up.
inline constexpr int kOpenTries = 16;

// Opens the metadata file to read and write; one that is missing is made, of mode 0777. *made tells
// whether this call did: nobody else may remove it. A descriptor, or -1 with errno.
int OpenOrMake(const char* path, bool* made);

// Whether two of them are one file.
inline bool SameFile(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

// Whether `path` still names the file on `fd`, which may have been removed, or replaced by another,
// since it was opened: before a lock on it was had, or by who may put a link there. Otherwise false
// with errno, ESTALE when it names another.
bool Names(const char* path, int fd);

// Whether it is a metadata file of that mode.
bool HasMetadataMode(const char* path, mode_t mode);

// Gives the metadata file `mode`, through a descriptor. Best effort: others may own the file.
void SetMetadataMode(const char* path, mode_t mode);

// What is at a path where a metadata file may be.
enum class Found { kFile, kNothing, kOther };

// kOther, for what is no regular file or cannot be looked at, with errno as kernel::OpenRegular()
// sets it.
Found LookAt(const char* path);

// Whether `path` may be handed to a program that copies or moves metadata: it is a regular file, or
// missing. Otherwise false, with errno as LookAt() sets it.
inline bool IsMetadataOrMissing(const char* path) { return LookAt(path) != Found::kOther; }

// The same of both ends of a copy.
inline bool AreMetadataOrMissing(const char* from, const char* to) {
    return IsMetadataOrMissing(from) && IsMetadataOrMissing(to);
}

}  // namespace mavoea

#endif  // MAVOEA_UTIL_METADATA_FILE_H_

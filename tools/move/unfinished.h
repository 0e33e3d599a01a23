// An object on its way to another file system: a file beside its copy, ".mavoea-moving-" and a hash
// of the copy's name, says which object it is, and whether its removal has begun. After an
// interruption the same command finds it, goes on where it would otherwise refuse to write into a
// directory that is not empty, and takes what is left of objects that have gone for what it is.
#ifndef MAVOEA_TOOLS_MOVE_UNFINISHED_H_
#define MAVOEA_TOOLS_MOVE_UNFINISHED_H_

#include <ctime>
#include <optional>
#include <string>

#include "tools/place/directory.h"

namespace mavoea::tool {

// All members throw Failure.
class UnfinishedMove {
 public:
    // Says that `source` is being moved to `to`; the file stays when nobody calls Forget().
    UnfinishedMove(const Place& to, const struct stat& source);

    // All of it has been copied: what was there before this goes, and when an object has gone what
    // is left of its metadata is of no use.
    void BeginRemoval() const;

    // The move has come to its end.
    void Forget() const { Forget(to_); }
    static void Forget(const Place& to);

    // Whether a move of `source` to `to` has begun, and not ended.
    static bool Find(const Place& to, const struct stat& source);

    // When the removal of what was moved to `to` began; none when no such move is unfinished.
    static std::optional<timespec> RemovalBegan(const Place& to);

 private:
    Place to_;
};

// Removes metadata in `inside`, a directory of which the removal began at that time, of objects
// that are no longer there and have their copies in `made`. What has changed since stays.
void RemoveLeftMetadata(const DirectoryRef& inside, const Directory& made, const timespec& began);

// The same for one object that has gone.
void RemoveLeftMetadata(const Place& from, const timespec& began);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_UNFINISHED_H_

// A metadata file beside its object: where it is, opening it, locking it.
#ifndef MAVOEA_TOOLS_SIDECAR_H_
#define MAVOEA_TOOLS_SIDECAR_H_

#include <optional>
#include <string>

#include "include/mavoea.h"
#include "tools/file.h"

namespace mavoea::tool {

enum class Access {
    kRead,
    kWrite,  // a file that is there
    kCreate  // to be written, and made where it is missing
};

struct Sidecar {
    std::string object;  // absolute path
    const char* kind;    // MAVOEA_KIND_...
    int place;           // EA_PLACE_...

    std::string Path() const;

    // None when there is no such file and it was not to be made. Throws Failure.
    std::optional<File> Open(Access access) const;
};

// The library's lock on a whole file, for work that does not go through a stream's handle. Another
// process in the way is a Failure.
class FileLock {
 public:
    FileLock(const File& file, Access access);
    ~FileLock();
    FileLock(const FileLock&) = delete;
    FileLock& operator=(const FileLock&) = delete;

 private:
    EASHandle holder_;
};

// Removes a file that was made for a change, should the change fail: half a header is of no use to
// anybody. Stands behind the lock, to go before it.
class RemoveIfFailed {
 public:
    RemoveIfFailed(const File& file, Access access);
    ~RemoveIfFailed();
    RemoveIfFailed(const RemoveIfFailed&) = delete;
    RemoveIfFailed& operator=(const RemoveIfFailed&) = delete;

 private:
    const File& file_;
    bool is_new_;
    int exceptions_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SIDECAR_H_

// A file that gets its name when it is whole: whoever finds it finds all that belongs into it.
#ifndef MAVOEA_OPS_NEW_FILE_H_
#define MAVOEA_OPS_NEW_FILE_H_

#include <sys/types.h>

#include <string_view>

#include "util/owned.h"
#include "util/path_text.h"

namespace mavoea {

class NewFile {
 public:
    // In that directory, open for reading and writing. Empty, with errno, when it cannot be made.
    NewFile(std::string_view directory, mode_t mode);
    // What has got no name by then is gone.
    ~NewFile();
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;

    explicit operator bool() const { return static_cast<bool>(fd_); }
    int fd() const { return fd_.get(); }

    // Gives it the name `path`, in its directory. False with errno, EEXIST when something has that
    // name.
    bool Name(const char* path);

 private:
    void MakeWithName(std::string_view directory, mode_t mode);

    UniqueFd fd_;
    // Its name meanwhile where the file system, or the kernel, has no files without one; else
    // empty.
    char temporary_[kPathBufferSize] = {};
};

}  // namespace mavoea

#endif  // MAVOEA_OPS_NEW_FILE_H_

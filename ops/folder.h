// A directory that is read entry by entry.
#ifndef MAVOEA_OPS_FOLDER_H_
#define MAVOEA_OPS_FOLDER_H_

#include <errno.h>

#include <string_view>

#include "platform/kernel.h"
#include "util/unit.h"

namespace mavoea {

class Folder {
 public:
    // A folder in the EA directory, where everybody may put a link in its place: kRefused. The
    // caller's own directory: kFollowed.
    enum class Links { kRefused, kFollowed };

    // Empty, with errno, when it cannot be opened.
    explicit Folder(const char* path, Links links = Links::kRefused)
        : dir_(links == Links::kFollowed ? kernel::Opendir(path) : kernel::OpendirItself(path)) {}
    ~Folder() { Close(); }
    Folder(const Folder&) = delete;
    Folder& operator=(const Folder&) = delete;

    explicit operator bool() const { return dir_ != nullptr; }
    int fd() const { return kernel::Dirfd(dir_); }
    void Rewind() { kernel::Rewinddir(dir_); }

    // The next entry, "." and ".." among them; nullptr at the end, and when the folder cannot be
    // read any further.
    const dirent* NextOfAll() {
        errno = 0;
        const dirent* const entry = kernel::Readdir(dir_);
        failed_ = entry == nullptr && errno != 0;
        return entry;
    }

    // Whether what ended the reading was a failure.
    bool failed() const { return failed_; }

    // The next entry other than "." and "..", valid until the next call; nullptr at the end.
    const dirent* NextEntry() {
        while (const dirent* const entry = NextOfAll()) {
            const std::string_view name = entry->d_name;
            if (name != "." && name != "..") return entry;
        }
        return nullptr;
    }
    const char* Next() {
        const dirent* const entry = NextEntry();
        return entry == nullptr ? nullptr : entry->d_name;
    }

    void Close() {
        const ErrnoKeeper keep;
        if (dir_ != nullptr) (void)kernel::Closedir(dir_);
        dir_ = nullptr;
    }

 private:
    DIR* dir_;
    bool failed_ = false;
};

}  // namespace mavoea

#endif  // MAVOEA_OPS_FOLDER_H_

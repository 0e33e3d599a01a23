// An open directory: what is in it, and removing that without following symbolic links.
#ifndef MAVOEA_TOOLS_DIRECTORY_H_
#define MAVOEA_TOOLS_DIRECTORY_H_

#include <sys/stat.h>

#include <optional>
#include <string>
#include <vector>

#include "tools/file.h"

namespace mavoea::tool {

// All members throw Failure.
class Directory {
 public:
    // A symbolic link is none.
    static Directory Open(const std::string& path);
    // None when that is not there, or no directory.
    std::optional<Directory> FindIn(const std::string& name) const;

    const std::string& path() const { return file_.path(); }
    std::string PathOf(const std::string& name) const;

    struct Entry {
        std::string name;
        mode_t type;  // S_IFREG, S_IFDIR, ...
    };
    // All but "." and "..", sorted by name, as it is at the time.
    std::vector<Entry> Entries() const;

    bool Has(const std::string& name) const;

    // False when nothing of that name is there any more. A directory goes with all that is in it.
    bool Remove(const std::string& name) const;

    // False when it is not there any more, or not empty.
    bool RemoveEmpty(const std::string& name) const;

 private:
    explicit Directory(File file) : file_(std::move(file)) {}

    File file_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_DIRECTORY_H_

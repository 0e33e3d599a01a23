// A metadata file that is changed in place, or made for a change.
#ifndef MAVOEA_TOOLS_STORE_CHANGED_FILE_H_
#define MAVOEA_TOOLS_STORE_CHANGED_FILE_H_

#include <memory>

#include "tools/place/directory.h"
#include "tools/store/rights.h"

namespace mavoea::tool {

// Locked against other processes until the end of its scope. A file that is made gets its name, and
// its object's rights, with Commit(); without, nothing of it stays. A dry run changes a copy
// without a name. All members throw Failure.
class ChangedFile {
 public:
    // Null when there is no such file and it is not to be made.
    static std::unique_ptr<ChangedFile> Open(const Place& object, const Place& file, bool make);

    // One that is to be made by a dry run, in a directory that is to be made as well.
    static std::unique_ptr<ChangedFile> Rehearse(const std::string& path);

    const File& file() const {
        if (copy_) return *copy_;
        return made_ ? made_->file() : *existing_;
    }
    const std::string& path() const { return file().path(); }

    void Commit();

    // For another change: locks it anew, since whoever closes any descriptor of it lets go of the
    // lock. False when it was made, or has another name or none by now: then it is to be opened.
    bool HoldAgain() const;

 private:
    ChangedFile() = default;

    std::shared_ptr<const File> existing_;
    std::unique_ptr<TemporaryFile> made_;
    std::shared_ptr<const File> copy_;  // in a dry run: what is changed in place of the two
    DirectoryRef directory_;            // of a file that is made
    Rights rights_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_CHANGED_FILE_H_

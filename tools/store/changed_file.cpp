#include "tools/store/changed_file.h"

#include <fcntl.h>

#include "tools/say/messages.h"
#include "tools/store/locking.h"

namespace mavoea::tool {

std::unique_ptr<ChangedFile> ChangedFile::Open(const Place& object, const Place& file, bool make) {
    std::unique_ptr<ChangedFile> changed(new ChangedFile);
    changed->existing_ = file.directory->FindFile(file.name, O_RDWR);
    if (changed->existing_) {
        LockFile(*changed->existing_, Access::kWrite);
        // Whoever can give it a second name could have another file changed.
        if (changed->existing_->Status().st_nlink > 1) {
            throw Failure(kFailed, file.path(), "it has several names, all of which would change",
                          "make it a file of its own: copy it, and put the copy in its place");
        }
        return changed;
    }
    if (!make) return nullptr;
    changed->rights_ = Rights::Of(*Inode::Open(object));
    changed->made_ = std::make_unique<TemporaryFile>(file);
    changed->directory_ = file.directory;
    return changed;
}

bool ChangedFile::HoldAgain() const {
    if (!existing_) return false;
    LockFile(*existing_, Access::kWrite);
    return existing_->Status().st_nlink == 1;
}

void ChangedFile::Commit() {
    if (!made_) return;
    rights_.Give(made_->file());
    made_->file().Sync();
    made_->GiveToNewTarget();
    directory_->Sync();
    made_.reset();
}

}  // namespace mavoea::tool

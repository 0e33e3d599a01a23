#include "tools/store/changed_file.h"

#include <fcntl.h>
#include <sys/mman.h>

#include <algorithm>
#include <cerrno>

#include "tools/place/dry_run.h"
#include "tools/say/messages.h"
#include "tools/store/locking.h"

namespace mavoea::tool {

namespace {

// A file without a name that begins with what another holds.
std::shared_ptr<const File> CopyInMemory(const File* original, const std::string& path) {
    constexpr std::uint64_t kPiece = 1U << 20;
    auto copy = std::make_shared<const File>(::memfd_create("mavoea", MFD_CLOEXEC), path);
    if (copy->fd() < 0) throw SystemFailure(path, errno);
    const std::uint64_t size = original == nullptr ? 0 : original->Size();
    for (std::uint64_t at = 0; at < size;) {
        const Bytes piece = original->Read(at, std::min(kPiece, size - at));
        if (piece.empty()) break;
        copy->Write(at, piece);
        at += piece.size();
    }
    return copy;
}

}  // namespace

std::unique_ptr<ChangedFile> ChangedFile::Rehearse(const std::string& path) {
    std::unique_ptr<ChangedFile> changed(new ChangedFile);
    changed->copy_ = CopyInMemory(nullptr, path);
    return changed;
}

std::unique_ptr<ChangedFile> ChangedFile::Open(const Place& object, const Place& file, bool make) {
    std::unique_ptr<ChangedFile> changed(new ChangedFile);
    nlink_t names = 0;
    constexpr int kAttempts = 10;
    for (int attempt = 0; names == 0 && attempt < kAttempts; ++attempt) {
        changed->existing_ = file.directory->FindFile(file.name, O_RDWR);
        if (!changed->existing_) break;
        LockFile(*changed->existing_, Access::kWrite);
        // Until it was locked somebody may have put another one in its place.
        names = changed->existing_->Status().st_nlink;
    }
    if (changed->existing_) {
        if (names == 0) {
            throw Failure(kFailed, file.path(), "somebody replaces it again and again",
                          "give the command again");
        }
        // Whoever can give it a second name could have another file changed.
        if (names > 1) {
            throw Failure(kFailed, file.path(), "it has several names, all of which would change",
                          "make it a file of its own: copy it, and put the copy in its place");
        }
        if (DryRun()) changed->copy_ = CopyInMemory(changed->existing_.get(), file.path());
        return changed;
    }
    if (!make) return nullptr;
    if (DryRun()) {
        if (const int error = WhyNoNewFile(*file.directory)) {
            throw SystemFailure(file.path(), error);
        }
        return Rehearse(file.path());
    }
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

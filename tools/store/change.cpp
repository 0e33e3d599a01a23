#include "tools/store/change.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <limits>

#include "format/apple_double.h"
#include "include/mavoea.h"
#include "tools/place/dry_run.h"
#include "tools/say/messages.h"
#include "tools/store/apple_double_file.h"
#include "tools/store/foreign/changer.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/marks.h"
#include "tools/store/reader.h"
#include "tools/store/record.h"
#include "tools/store/rights.h"
#include "tools/store/sidecars.h"
#include "tools/store/stream_file.h"
#include "util/superuser_scope.h"

namespace mavoea::tool {
namespace {

// As far as that is known before.
void RequireEaDirectoryCanBeMade(const Directory& beside) {
    const SuperuserScope superuser;
    const int error = superuser.ok() ? WhyNoNewFile(beside) : EPERM;
    if (error == 0) return;
    throw LibraryFailure(beside.PathOf(kEaDirName), {MAVOEA_ERR_MAKE_DIRECTORY, error});
}

// ---- Volumes that keep metadata in files beside the object --------------------------------------

class FileChanger final : public Changer {
 public:
    explicit FileChanger(const Object& object)
        : object_(object), has_record_(object.kind() == VolumeKind::kFileEA) {
        const Place& place = object.place;
        if (object.keeping() == Keeping::kAppleDouble) {
            const std::string name = AppleDoubleName(place.name);
            if (name.empty()) {
                throw Failure(kFailed, object.path(), "the path of its metadata would be too long",
                              "use a shorter name or path");
            }
            names_ = {name};
        } else {
            RequireOwnNames(object);
            const std::string derived = NameInEaDirectory(place.name);
            names_ = {derived + "@" MAVOEA_KIND_RESOURCE, derived + "@" MAVOEA_KIND_STREAM};
        }
    }

    void Set(const std::string& name, const Bytes& value) override {
        switch (KindOf(name)) {
            case Kind::kAttribute:
            case Kind::kLocked: {
                const auto file = Open(names_.back(), true);
                StreamFile(*file).Set(name, value);
                file->Commit();
                return;
            }
            case Kind::kFinderInfo:
                CheckFinderInfoSize(object_.path(), value);
                // Nothing at all means none, also where another file still has some.
                if (IsAllZero(value)) {
                    Remove(name);
                } else {
                    SetFinderInfo(value);
                }
                return;
            case Kind::kResourceFork:
                if (value.empty()) {
                    Remove(name);
                } else {
                    const auto file = Open(names_.front(), true);
                    AppleDoubleFile(*file).SetFork(value);
                    file->Commit();
                }
                return;
        }
    }

    bool Remove(const std::string& name) override {
        const Kind kind = KindOf(name);
        if (kind == Kind::kAttribute || kind == Kind::kLocked) {
            const auto file = Open(names_.back(), false);
            return file && StreamFile(*file).Remove(name);
        }
        bool removed = false;
        std::shared_ptr<const Inode> inode;
        std::optional<Record> record;
        if (kind == Kind::kFinderInfo && has_record_) {
            inode = Inode::Open(object_.place);
            record = Record::Read(*inode);
        }
        for (const std::string& holder : names_) {
            const auto opened = Open(holder, false);
            if (!opened) continue;
            AppleDoubleFile file(*opened);
            if (kind == Kind::kFinderInfo && file.HasFinderInfo()) {
                file.SetFinderInfo(Bytes(kFinderInfoSize));
                removed = true;
            }
            if (kind == Kind::kResourceFork && file.ForkLength() > 0) {
                file.SetFork({});
                removed = true;
            }
        }
        if (record && record->HasFinderInfo()) {
            record->SetFinderInfo(Bytes(kFinderInfoSize));
            record->Store(*inode);
            removed = true;
        }
        if (removed && inode) StampFlushTime(*inode);
        return removed;
    }

 private:
    std::unique_ptr<ChangedFile> Open(const std::string& name, bool make) const {
        DirectoryRef in = object_.place.directory;
        if (object_.keeping() == Keeping::kEaDirectory) {
            const DirectoryRef beside = in;
            in = make && !DryRun() ? NeedEaDirectory(*in) : in->FindAgain(kEaDirName);
            if (!in && make) {
                RequireEaDirectoryCanBeMade(*beside);
                return ChangedFile::Rehearse(beside->PathOf(kEaDirName) + '/' + name);
            }
        }
        return in ? ChangedFile::Open(object_.place, {in, name}, make) : nullptr;
    }

    // Into the first holder, then into the record: a record that is there keeps its other entries,
    // one that is missing is made.
    void SetFinderInfo(const Bytes& value) const {
        std::shared_ptr<const Inode> inode;
        std::optional<Record> record;
        if (has_record_) {
            inode = Inode::Open(object_.place);
            record = Record::Read(*inode);
        }
        if (record) record->SetFinderInfo(value);
        const auto file = Open(names_.front(), true);
        AppleDoubleFile(*file).SetFinderInfo(value);
        file->Commit();
        if (record) record->Store(*inode);
        if (inode && !record) StoreFreshRecord(*inode, value);
        if (inode) StampFlushTime(*inode);
    }

    const Object object_;
    bool has_record_;
    // Of Finder info and resource fork: the first that has them is believed, and written; the last
    // has the attributes.
    std::vector<std::string> names_;
};

// ---- Volumes that keep attributes of the object itself ------------------------------------------

class AttributeChanger final : public Changer {
 public:
    explicit AttributeChanger(const Object& object) : inode_(Inode::Open(object.place)) {
        if (inode_->HoldsContents()) return;
        throw Failure(kFailed, object.path(), "only files and directories have attributes",
                      "name what it leads to, if it is a symbolic link");
    }

    void Set(const std::string& name, const Bytes& value) override {
        if (value.size() > std::size_t{std::numeric_limits<int>::max()}) {
            throw Failure(kFailed, inode_->path(), "the value has 2 GiB or more",
                          "use a smaller value");
        }
        if (KindOf(name) == Kind::kFinderInfo) CheckFinderInfoSize(inode_->path(), value);
        if (KindOf(name) != Kind::kResourceFork) return inode_->SetAttribute(name, value);
        static constexpr std::uint8_t kNothing = 0;  // The library takes no NULL.
        LibraryError error;
        if (DryRun()) {
            if (ForkSize() >= 0) return;
            error.error = errno;
        } else {
            const ErrorMark mark;
            if (MAVOEAXattrSet(inode_->ProcPath().c_str(), name.c_str(),
                               value.empty() ? &kNothing : value.data(),
                               static_cast<int>(value.size()), 0) == 0) {
                return;
            }
            error = mark.Get();
        }
        if (!OffersNoFork(error)) throw LibraryFailure(inode_->path(), error);
        throw Failure(kFailed, inode_->path(), "its file system offers no resource fork for it",
                      "only files have one, on volumes of Mac file systems");
    }

    bool Remove(const std::string& name) override {
        if (KindOf(name) != Kind::kResourceFork) return inode_->RemoveAttribute(name);
        // The library would give the file another mode to look for one.
        if (DryRun()) return ForkSize() > 0;
        const std::string path = inode_->ProcPath();
        const ErrorMark mark;
        // Emptying a fork that is empty succeeds.
        if (MAVOEAXattrGet(path.c_str(), name.c_str(), nullptr, 0) > 0 &&
            MAVOEAXattrRemove(path.c_str(), name.c_str()) == 0) {
            return true;
        }
        const LibraryError error = mark.Get();
        if (OffersNoFork(error) || error.error == ENODATA) return false;
        throw LibraryFailure(inode_->path(), error);
    }

 private:
    // Negative with errno.
    off_t ForkSize() const {
        struct stat info;
        return ::stat((inode_->ProcPath() + "/rsrc").c_str(), &info) == 0 ? info.st_size : -1;
    }

    // Directories have none, and most file systems offer none.
    static bool OffersNoFork(const LibraryError& error) {
        return error.code == MAVOEA_ERR_NOTHING_THERE || error.error == ENOTDIR ||
               error.error == ENOENT;
    }

    std::shared_ptr<const Inode> inode_;
};

// ---- The lock -----------------------------------------------------------------------------------

// What the library sets in records that say something of the lock.
constexpr std::uint16_t kLockedByLibrary = 0xA000;

std::uint16_t WithLock(std::uint16_t word, bool locked) {
    return static_cast<std::uint16_t>(locked ? word | kLockedByLibrary
                                             : word & ~(kAfpLocking | kLockedByLibrary));
}

void SetRecordLock(const Object& object, const Inode& inode, bool locked) {
    if (object.kind() == VolumeKind::kFileEA) {
        auto record = Record::Read(inode);
        const auto word = record ? record->AfpAttributes() : std::nullopt;
        if (!word || WithLock(*word, locked) == *word) return;
        record->SetAfpAttributes(WithLock(*word, locked));
        return record->Store(inode);
    }
    const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kLeaveOut);
    if (!sidecars.resource) return;
    const Place place = {sidecars.resource->directory, sidecars.resource->name};
    {
        // Nothing is opened for writing that need not be.
        const auto file = place.directory->FindFile(place.name, O_RDONLY);
        if (!file || !ReadLayout(*file).FindEntry(EntryId::kAfpFileInfo)) return;
    }
    RequireOwnNames(object);
    const auto changed = ChangedFile::Open(object.place, place, false);
    if (!changed) return;
    AppleDoubleFile file(*changed);
    const auto word = file.AfpAttributes();
    if (word && WithLock(*word, locked) != *word) file.SetAfpAttributes(WithLock(*word, locked));
}

// A "._" file that had the rights of a locked object gets those of the unlocked one.
void LetSidecarFollow(const Object& object, const Inode& inode, mode_t before) {
    const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kLeaveOut);
    const auto& found = sidecars.apple_double;
    if (!found || (found->info.st_mode & kPermissionBits) != (before & 0666)) return;
    const auto file = found->directory->FindFile(found->name, O_RDONLY);
    if (file && file->Status().st_nlink == 1 && !DryRun()) Rights::Of(inode).Give(*file);
}

class LockChanger final : public Changer {
 public:
    LockChanger(const Object& object, std::unique_ptr<Changer> changer)
        : object_(object), changer_(std::move(changer)) {}

    void Set(const std::string& name, const Bytes& value) override {
        if (KindOf(name) != Kind::kLocked) return changer_->Set(name, value);
        if (value.size() != 1 || (value[0] != '0' && value[0] != '1')) {
            throw Failure(kFailed, object_.path(), "the locked state is 0 or 1",
                          "give it without a line's end, or use mavoea lock and mavoea unlock");
        }
        (void)SetLocked(object_, value[0] == '1');
    }

    bool Remove(const std::string& name) override {
        if (KindOf(name) != Kind::kLocked) return changer_->Remove(name);
        if (!ReadMetadata(object_, Sidecars::Services::kLeaveOut).locked) return false;
        return SetLocked(object_, false);
    }

 private:
    const Object object_;
    std::unique_ptr<Changer> changer_;
};

std::unique_ptr<Changer> MakeChanger(const Object& object) {
    RequireParent(object);
    RequireDeclared(object);
    if (const Dialect* const dialect = object.dialect()) {
        return OpenForeignChanger(object, *dialect);
    }
    switch (object.keeping()) {
        case Keeping::kAppleDouble:
        case Keeping::kEaDirectory:
            return std::make_unique<FileChanger>(object);
        case Keeping::kXattr:
            return std::make_unique<AttributeChanger>(object);
        case Keeping::kNone:
            break;
    }
    throw NoStore(object);
}

}  // namespace

void CheckFinderInfoSize(const std::string& path, const Bytes& value) {
    if (value.size() == kFinderInfoSize) return;
    throw Failure(kFailed, path,
                  "Finder info has " + std::to_string(kFinderInfoSize) + " bytes, the value has " +
                      std::to_string(value.size()),
                  "give all of them, as with --hex and 64 digits");
}

std::unique_ptr<Changer> OpenChanger(const Object& object) {
    return std::make_unique<LockChanger>(object, MakeChanger(object));
}

bool SetLocked(const Object& object, bool locked) {
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    RequireDeclared(object);
    const Metadata metadata = ReadMetadata(object, Sidecars::Services::kLeaveOut);
    if (!metadata.problems.empty()) throw Failure(metadata.problems.front());
    const auto inode = Inode::Open(object.place);
    bool will_be = metadata.locked;
    if (inode->HoldsContents()) {
        const Dialect* const dialect = object.dialect();
        will_be = locked;
        if (dialect != nullptr && dialect->marks != Dialect::Marks::kHost) {
            SetForeignLock(*dialect, *inode, locked);
        } else if (LocksByMode(object)) {
            const mode_t before = inode->info().st_mode;
            if (locked && (before & kWriteBits) != 0) LockMode(*inode, before & kPermissionBits);
            if (!locked) UnlockMode(*inode);
            if (!locked) LetSidecarFollow(object, *inode, before);
            if (!locked && dialect != nullptr) SetForeignLock(*dialect, *inode, false);
        } else {
            if (DryRun() && locked) will_be = metadata.locked || TakesMarks(*inode);
            SetLockFlag(*inode, locked);
            SetRecordLock(object, *inode, locked);
            // An upgrade may have taken the write bits.
            if (!locked && RemembersMode(*inode)) UnlockMode(*inode);
        }
    }
    if (!DryRun()) will_be = ReadMetadata(object, Sidecars::Services::kLeaveOut).locked;
    if (will_be == locked) return metadata.locked != locked;
    throw Failure(kFailed, object.path(),
                  locked ? "its file system cannot keep the locked state" : "it stays locked",
                  "the locked state takes a file system with attributes of users, and an object "
                  "that may have them");
}

}  // namespace mavoea::tool

#include "tools/transfer/rename.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>

#include "include/mavoea.h"
#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/store/marks.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/indexes.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;

bool IsListed(const Place& place) {
    const auto entries = place.directory->Entries();
    return std::any_of(entries.begin(), entries.end(),
                       [&](const auto& entry) { return entry.name == place.name; });
}

class Renaming {
 public:
    Renaming(const Place& from, const Place& to)
        : from_(from), to_(to), inode_(Inode::Open(from)), there_(to.Status()) {}

    bool Run() {
        const Object source = ObjectAt(from_, &inode_->info());
        const Object target = ObjectAt(to_, &inode_->info());
        // Below the two a directory would be kept in other ways.
        if (source.kind() != target.kind()) return false;
        // A file system that ignores case knows one file by both names, but lists one of them.
        const bool same = there_ && SameFile(*there_, inode_->info());
        case_only_ = same && !(IsListed(from_) && IsListed(to_));
        if (inode_->info().st_dev != to_.directory->Status().st_dev) return false;

        sidecars_ = Sidecars::Find(source, Sidecars::Services::kFind);
        if (there_ && !case_only_) old_ = Sidecars::Find(target, Sidecars::Services::kFind);
        if (!there_) old_ = Sidecars::Find(target, Sidecars::Services::kFind);
        if (sidecars_.problem) throw Failure(*sidecars_.problem);
        if (sidecars_.Any()) RequirePlace(target);
        RequireOwnNames(source, sidecars_);
        if (sidecars_.AnyByName() || old_.AnyByName()) RequireOthersNames(target);
        Plan(target);

        if (!TryToRename(from_, to_)) {
            if (errno == EXDEV) return false;
            throw SystemFailure(from_.path(), errno);
        }
        // Two names of one file are left as they are.
        if (same && !case_only_) (void)from_.directory->RemoveFile(from_.name);
        try {
            Move(target);
        } catch (const Failure&) {
            TakeBack();
            throw;
        }
        if (sidecars_.ea_dir) RemoveEaDirectoryIfEmpty(*from_.directory);
        if (inode_->HoldsContents() && source.keeping() == Keeping::kEaDirectory) {
            SetArchived(*inode_);
        }
        ReportRenamed(from_.path(), to_.path());
        return true;
    }

 private:
    struct Step {
        Place from;
        Place to;
        bool done = false;
    };

    // False with errno. Where two names that differ in case only are one, a rename may change
    // nothing: it takes a third name.
    bool TryToRename(const Place& from, const Place& to) const {
        const auto rename = [](const Place& one, const Place& other) {
            return ::renameat(one.directory->fd(), one.name.c_str(), other.directory->fd(),
                              other.name.c_str()) == 0;
        };
        if (!rename(from, to)) return false;
        if (!case_only_ || IsListed(to) || !IsListed(from)) return true;
        const Place between = {from.directory, TemporaryName()};
        if (!rename(from, between)) return false;
        if (rename(between, to)) return true;
        const int error = errno;
        (void)rename(between, from);
        errno = error;
        return false;
    }

    // The object itself is none of the others.
    void RequireOthersNames(const Object& target) const {
        const auto other = SharesNames(to_);
        if (!other || *other == from_.name) return;
        RequireOwnNames(target);
    }

    // Where everything goes, and that nothing but metadata is in its way.
    void Plan(const Object& target) {
        const auto ea_place = [&](const std::string& kind) {
            return Place{NeedEaDirectory(*to_.directory), NameInEaDirectory(to_.name) + kind};
        };
        const auto add = [&](const std::optional<Found>& found, const std::string& kind) {
            if (found) Add({found->directory, found->name}, ea_place(kind));
        };
        add(sidecars_.stream, "@" MAVOEA_KIND_STREAM);
        add(sidecars_.resource, "@" MAVOEA_KIND_RESOURCE);
        add(sidecars_.resource_copy, "@" MAVOEA_KIND_RESOURCE "Tmp");
        for (const Sidecars::Service& service : sidecars_.services) {
            if (service.name.front() == '@') add(service.found, service.name);
        }
        if (sidecars_.folder) {
            Add({sidecars_.ea_dir, from_.name}, {NeedEaDirectory(*to_.directory), to_.name});
        }
        if (const auto& found = sidecars_.apple_double) {
            const std::string name = AppleDoubleName(to_.name);
            if (name.empty()) {
                throw Failure(kFailed, target.path(), "its name is too long for its \"._\" file",
                              "use a shorter name");
            }
            const auto there = to_.directory->StatusOf(name);
            if (there && !SameFile(*there, found->info) && !IsAppleDouble(*to_.directory, name)) {
                throw InTheWay({to_.directory, name});
            }
            Add({found->directory, found->name}, {to_.directory, name});
        }
    }

    Failure InTheWay(const Place& place) const {
        return {kFailed, from_.path(),
                "something is in the way of its metadata at " + Printable(place.path()),
                "see what it is, and move it away"};
    }

    void Add(const Place& from, const Place& to) {
        const auto info = to.Status();
        const auto own = from.Status();
        if (info && own && (info->st_mode & S_IFMT) != (own->st_mode & S_IFMT)) throw InTheWay(to);
        steps_.push_back({from, to});
    }

    // What belonged to the replaced object goes; nothing of it may be taken for this one's.
    void Move(const Object& target) {
        if (old_.folder) {
            RemoveFiles(FilesIn(old_.folder));
            (void)old_.ea_dir->RemoveEmpty(to_.name);
        }
        for (Step& step : steps_) {
            if (!step.from.Status()) continue;  // gone meanwhile
            if (!TryToRename(step.from, step.to)) throw SystemFailure(step.from.path(), errno);
            step.done = true;
        }
        std::vector<Found> left = old_.Files();
        std::erase_if(left, [&](const Found& found) {
            return std::any_of(steps_.begin(), steps_.end(), [&](const Step& step) {
                return step.done && step.to.name == found.name &&
                       SameFile(step.to.directory->Status(), found.directory->Status());
            });
        });
        RemoveFiles(left);
        if (!left.empty()) RemoveEmptyDirectories(target, old_);
    }

    std::vector<Found> FilesIn(const DirectoryRef& folder) const {
        std::vector<Found> files = old_.Files();
        std::erase_if(files, [&](const Found& found) {
            return !found.directory->path().starts_with(folder->path());
        });
        return files;
    }

    void TakeBack() {
        if (there_ && !case_only_) return;
        if (!TryToRename(to_, from_)) return;
        for (const Step& step : steps_) {
            if (step.done) (void)TryToRename(step.to, step.from);
        }
    }

    const Place& from_;
    const Place& to_;
    std::shared_ptr<const Inode> inode_;
    std::optional<struct stat> there_;
    bool case_only_ = false;
    Sidecars sidecars_;
    Sidecars old_;
    std::vector<Step> steps_;
};

}  // namespace

bool RenameObject(const Place& from, const Place& to) { return Renaming(from, to).Run(); }

}  // namespace mavoea::tool

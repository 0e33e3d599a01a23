#include "tools/transfer/removal.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "tools/place/dry_run.h"
#include "tools/say/job.h"
#include "tools/store/writer.h"
#include "tools/transfer/indexes.h"

namespace mavoea::tool {
namespace {

// How many directories of a tree are open at a time; each may keep its EA directory open, too.
constexpr std::size_t kMostOpen = 16;

Failure HasNotGone(const std::string& path) {
    return {kFailed, path, "it has changed, or come, since its directory was carried",
            "give the command again"};
}

// The call that removes an object.
void Unlink(const Place& place, int flags) {
    if (DryRun()) {
        if (const int error = WhyNoRemoval(place)) throw SystemFailure(place.path(), error);
        if ((flags & AT_REMOVEDIR) != 0) return Foreseen::GoWithAll(*place.directory, place.name);
        return Foreseen::Go(*place.directory, place.name);
    }
    if (::unlinkat(place.directory->fd(), place.name.c_str(), flags) != 0) {
        throw SystemFailure(place.path(), errno);
    }
}

// What lies beside an object that is about to go.
class Beside {
 public:
    Beside(const Object& object, bool alone, const MayGo& may_go)
        : object_(object),
          sidecars_(Sidecars::Find(object, Sidecars::Services::kFind, may_go.was_metadata)) {
        if (!sidecars_.AnyByName()) return;
        if (alone) {
            RequireOwnNames(object);
        } else if (SharesNames(object.place)) {
            shared_ = true;  // it goes with the last of them
        }
    }

    bool in_ea_directory() const { return sidecars_.ea_dir != nullptr; }

    // Before anything goes.
    void RequireMayGo(const MayGo& may_go) const {
        if (shared_ || !may_go) return;
        for (const Sidecars::Found& file : sidecars_.Files()) {
            if (!S_ISDIR(file.info.st_mode) && !may_go(file.info)) throw HasNotGone(file.path());
        }
    }

    void Remove() const {
        if (shared_) return;
        RemoveFiles(sidecars_.Files());
        if (DryRun()) {
            for (const Sidecars::Found& file : sidecars_.Files()) {
                Foreseen::Go(*file.directory, file.name);
            }
        }
        if (sidecars_.folder) (void)sidecars_.ea_dir->RemoveEmpty(object_.place.name);
    }

 private:
    const Object& object_;
    Sidecars sidecars_;
    bool shared_ = false;
};

// An EA directory in which nothing belongs to an object any more.
void RemoveEaDirectory(const Directory& inside, const MayGo& may_go) {
    const auto remove = [&](const auto& self, const Directory& in) -> void {
        for (const Directory::Entry& entry : in.Entries()) {
            if (S_ISDIR(entry.type)) {
                if (const DirectoryRef folder = in.FindIn(entry.name)) self(self, *folder);
                (void)in.RemoveEmpty(entry.name);
                continue;
            }
            if (may_go && entry.name != kCoverName) {
                const auto now = in.StatusOf(entry.name);
                if (now && !may_go(*now)) throw HasNotGone(in.PathOf(entry.name));
            }
            (void)in.RemoveFile(entry.name);
        }
    };
    remove(remove, *inside.OpenIn(kEaDirName));
    (void)inside.RemoveEmpty(kEaDirName);
}

// But for the EA directory.
void RequireNothingLeft(const Directory& inside, const Place& place) {
    for (const Directory::Entry& entry : inside.Entries()) {
        if (entry.name != kEaDirName) throw SystemFailure(place.path(), ENOTEMPTY);
    }
}

// The indexes know nothing of what no path leads to.
void ReportRemovedAt(const Place& place) {
    if (place.directory->HasLocation(place.name)) ReportRemoved(place.location());
}

// Both return whether an EA directory is beside it, in which nothing may be left.
bool RemoveFileAt(const Object& object, bool alone, const MayGo& may_go) {
    const Place& place = object.place;
    const Beside beside(object, alone, may_go);
    if (may_go && !may_go(StatusOf(place))) throw HasNotGone(place.path());
    beside.RequireMayGo(may_go);
    // Data first: without it, metadata is of no use to anybody.
    Unlink(place, 0);
    beside.Remove();
    ReportRemovedAt(place);
    return beside.in_ea_directory();
}

// `inside` is null where nobody may look into it.
bool RemoveDirectoryAt(const Object& object, const Directory* inside, bool alone,
                       const MayGo& may_go) {
    const Place& place = object.place;
    const Beside beside(object, alone, may_go);
    beside.RequireMayGo(may_go);
    const auto ea_dir = inside == nullptr ? std::nullopt : inside->StatusOf(kEaDirName);
    if (ea_dir && S_ISDIR(ea_dir->st_mode) && !inside->RemoveEmpty(kEaDirName)) {
        RequireNothingLeft(*inside, place);
        RemoveEaDirectory(*inside, may_go);
    }
    if (inside != nullptr && DryRun()) RequireNothingLeft(*inside, place);
    Unlink(place, AT_REMOVEDIR);
    beside.Remove();
    ReportRemovedAt(place);
    return beside.in_ea_directory();
}

}  // namespace

void RemoveObject(const Object& object, bool alone, const MayGo& may_go) {
    if (RemoveFileAt(object, alone, may_go)) RemoveEaDirectoryIfEmpty(*object.place.directory);
}

void RemoveEmptyDirectory(const Object& object, bool alone, const MayGo& may_go) {
    const DirectoryRef inside = object.place.Open();
    if (RemoveDirectoryAt(object, inside.get(), alone, may_go)) {
        RemoveEaDirectoryIfEmpty(*object.place.directory);
    }
}

// ---- Trees --------------------------------------------------------------------------------------

bool WouldBeGone(const Place& place) {
    if (!DryRun()) return false;
    const auto* const entry = Foreseen::Find(*place.directory, place.name);
    if (entry != nullptr && !entry->info) return true;
    // Or a directory above it.
    struct stat below = {};
    struct stat info;
    for (std::string above = ".";; above += "/..") {
        if (::fstatat(place.directory->fd(), above.c_str(), &info, 0) != 0) return false;
        if (Foreseen::HasGone(info)) return true;
        if (SameFile(info, below)) return false;
        below = info;
    }
}

void TreeRemoval::RemoveTree(const Place& named, const struct stat& info) {
    if (named_.directory != named.directory) Tidy();
    named_ = named;
    Guard(named, [&] { S_ISDIR(info.st_mode) ? Enter(named) : RemoveFile(named); });
    while (!levels_.empty()) {
        if (Stopped()) return Close();
        Go();
    }
}

void TreeRemoval::Tidy() {
    if (!std::exchange(untidy_, false)) return;
    Guard(named_, [&] { RemoveEaDirectoryIfEmpty(*named_.directory); });
}

template <class Work>
void TreeRemoval::Guard(const Place& place, Work work) {
    try {
        return work();
    } catch (const SystemFailure& failure) {
        const std::string path = place.path();
        if (MayBeGone() && failure.error() == ENOENT && failure.subject() == path) return;
        StayAbove();
        Fail(path, Refusal("cannot remove " + Quoted(failure.subject()), failure.error()));
    } catch (const Failure& failure) {
        StayAbove();
        Fail(place.path(), failure);
    }
}

// The next of what is in the innermost directory, or that directory itself.
void TreeRemoval::Go() {
    Level& level = levels_.back();
    if (level.next == level.entries.size()) return Leave();
    const Directory::Entry entry = level.entries[level.next++];
    const Place place = {level.inside, entry.name};
    const bool directory = S_ISDIR(entry.type);
    Guard(place, [&] {
        if (IsObject(place.directory, entry)) directory ? Enter(place) : RemoveFile(place);
    });
}

void TreeRemoval::Enter(const Place& place) {
    Level level = {place.name, {}, place.Open()};
    level.info = level.inside->Status();
    try {
        level.entries = CandidatesIn(level.inside);
    } catch (const SystemFailure& failure) {
        if (failure.subject() != level.inside->path()) throw;
        level.error = failure.error();
    }
    const bool empty = level.error == 0 && std::none_of(level.entries.begin(), level.entries.end(),
                                                        [&](const auto& entry) {
                                                            return IsObject(level.inside, entry);
                                                        });
    if (MayEnter(place, level.info, empty) == Answer::kNo) return StayAbove();
    level.agreed = empty;
    levels_.push_back(std::move(level));
    if (levels_.size() > kMostOpen) levels_[levels_.size() - 1 - kMostOpen].inside = nullptr;
}

void TreeRemoval::Leave() {
    const std::size_t above = levels_.size() - 1;
    if (above > 0 && !levels_[above - 1].inside) {
        const Place place = {levels_.back().inside, "."};
        Guard(place, [&] {
            levels_[above - 1].inside = place.directory->OpenAbove(levels_[above - 1].info);
        });
        if (!levels_[above - 1].inside) return Close();
    }
    const Place place = PlaceOfLast();
    const Level done = std::move(levels_.back());
    levels_.pop_back();
    bool gone = false;
    Guard(place, [&] {
        if (done.left || (!done.agreed && MayRemove(place, S_IFDIR) == Answer::kNo)) return;
        if (Stopped()) return;
        const Object object = ObjectAt(place, &done.info);
        try {
            const Directory* const inside = done.error == 0 ? done.inside.get() : nullptr;
            NoteUntidy(RemoveDirectoryAt(object, inside, at_top(), may_go_));
        } catch (const SystemFailure& failure) {
            // That it is not empty says nothing where nobody could see why.
            if (done.error == 0 || failure.subject() != place.path()) throw;
            throw SystemFailure(place.path(), done.error);
        }
        gone = true;
        Removed(place, S_IFDIR);
    });
    if (!gone && done.untidy) Guard(place, [&] { RemoveEaDirectoryIfEmpty(*done.inside); });
}

void TreeRemoval::RemoveFile(const Place& place) {
    if (MayRemove(place, S_IFREG) == Answer::kNo || Stopped()) return;
    NoteUntidy(RemoveFileAt(FileAt(place), at_top(), may_go_));
    Removed(place, S_IFREG);
}

// What is no directory is on a volume of the type that its directory is on.
Object TreeRemoval::FileAt(const Place& place) {
    if (at_top()) return ObjectAt(place, nullptr);
    std::optional<int>& type = levels_.back().type;
    if (!type) type = ObjectAt(place, nullptr).type;
    return {place, *type};
}

Place TreeRemoval::PlaceOfLast() const {
    if (levels_.size() == 1) return named_;
    return {levels_[levels_.size() - 2].inside, levels_.back().name};
}

// Leaves the rest as it is.
void TreeRemoval::Close() {
    const std::vector<Level> levels = std::move(levels_);
    levels_.clear();
    for (const Level& level : levels) {
        if (!level.inside || !level.untidy) continue;
        Guard({level.inside, "."}, [&] { RemoveEaDirectoryIfEmpty(*level.inside); });
    }
}

void TreeRemoval::NoteUntidy(bool untidy) {
    if (untidy) (at_top() ? untidy_ : levels_.back().untidy) = true;
}

void TreeRemoval::StayAbove() {
    for (auto level = levels_.rbegin(); level != levels_.rend() && !level->left; ++level) {
        level->left = true;
    }
}

namespace {

class CarriedRemoval final : public TreeRemoval {
 public:
    CarriedRemoval(const MayGo& was_carried,
                   const std::function<void(const Place&, mode_t)>& removed,
                   const std::function<void(const std::string&, const Failure&)>& fail)
        : TreeRemoval(was_carried), removed_(removed), fail_(fail) {}

    bool failed() const { return failed_; }

 private:
    void Removed(const Place& place, mode_t type) override { removed_(place, type); }
    void Fail(const std::string& path, const Failure& failure) override {
        failed_ = true;
        fail_(path, failure);
    }

    const std::function<void(const Place&, mode_t)>& removed_;
    const std::function<void(const std::string&, const Failure&)>& fail_;
    bool failed_ = false;
};

}  // namespace

bool RemoveCarried(const Place& named, const struct stat& info, const MayGo& was_carried,
                   const std::function<void(const Place& place, mode_t type)>& removed,
                   const std::function<void(const std::string& path, const Failure&)>& fail) {
    CarriedRemoval removal(was_carried, removed, fail);
    removal.RemoveTree(named, info);
    removal.Tidy();
    return !removal.failed();
}

std::string RemovalLine(const Place& place, mode_t type) {
    return (S_ISDIR(type) ? "removed directory " : "removed ") + Quoted(place.path());
}

}  // namespace mavoea::tool

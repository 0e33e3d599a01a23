#include "tools/transfer/rename.h"

#include <fcntl.h>
#include <linux/stat.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>

#include "include/mavoea.h"
#include "tools/place/dry_run.h"
#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/store/marks.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/indexes.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;
using Part = Pending::Part;

// False with errno.
bool TryToRename(const Place& from, const Place& to) {
    return ::renameat(from.directory->fd(), from.name.c_str(), to.directory->fd(),
                      to.name.c_str()) == 0;
}

// Whether nothing can be renamed from one of them into the other: one file system may be mounted
// at several places.
bool AreApart(const Directory& one, const Directory& other) {
    if (one.Status().st_dev != other.Status().st_dev) return true;
    const auto mount = [](const Directory& directory) -> std::uint64_t {
        struct statx info;
        const int fd = directory.OnDisk().fd();
        return ::statx(fd, "", AT_EMPTY_PATH, STATX_MNT_ID, &info) == 0 ? info.stx_mnt_id : 0;
    };
    return mount(one) != mount(other);
}

// Whether a rename of that inode, or into its place, has left something in an EA directory.
bool ListsPendingOf(const DirectoryRef& ea_dir, ino_t inode) {
    if (!ea_dir) return false;
    const auto& all = ea_dir->EntriesAtFirst();
    auto entry = std::lower_bound(
        all.begin(), all.end(), kOwnPrefix,
        [](const Directory::Entry& one, std::string_view name) { return one.name < name; });
    for (; entry != all.end() && entry->name.starts_with(kOwnPrefix); ++entry) {
        const auto owner = PendingOwner::Parse(entry->name);
        if (owner && owner->inode == inode) return true;
    }
    return false;
}

// What is told, and marked, once an object has its new name.
void Conclude(const Object& source, const Object& target, const struct stat& info) {
    const bool marked = S_ISREG(info.st_mode) || S_ISDIR(info.st_mode);
    if (marked && target.keeping() == Keeping::kEaDirectory) {
        const auto inode = Inode::Find(target.place);
        // Something else may have come there by now.
        if (inode && SameFile(inode->info(), info)) SetArchived(*inode);
    }
    ReportRenamed(source.path(), target.path());
}

// Removes what `target` has under the names of `source`, its former one, as well. Where case does
// not matter both may be one, of which one is listed.
void RemoveSecondNames(const Object& source, const Object& target) {
    const Sidecars old = Sidecars::Find(source, Sidecars::Services::kFind);
    const std::vector<Found> files = Sidecars::Find(target, Sidecars::Services::kFind).Files();
    std::vector<Found> left = old.Files();
    std::erase_if(left, [&](const Found& one) {
        return std::none_of(files.begin(), files.end(), [&](const Found& other) {
            if (!SameFile(one.info, other.info)) return false;
            if (!SameFile(one.directory->Status(), other.directory->Status())) return true;
            return one.name != other.name && IsListed({one.directory, one.name}) &&
                   IsListed({other.directory, other.name});
        });
    });
    RemoveFiles(left);
    RemoveEmptyDirectories(source, old);
}

class Renaming {
 public:
    Renaming(const Place& from, const Place& to)
        : from_(from), to_(to), info_(StatusOf(from)), there_(to.Status()) {}

    bool Run() {
        const Object source = ObjectAt(from_, &info_);
        const Object target = ObjectAt(to_, &info_);
        // Below the two a directory would be kept in other ways.
        if (source.kind() != target.kind() || source.dialect() != target.dialect()) return false;
        keeping_ = source.keeping();
        // A file system that ignores case knows one file by both names, but lists one of them.
        same_ = there_ && SameFile(*there_, info_);
        case_only_ = same_ && !(IsListed(from_) && IsListed(to_));

        Look(source, target);
        const bool pending = IsAnythingPending();
        const bool plain = !pending && !sidecars_.problem && !sidecars_.Any() && !old_.Any();
        // Of an object without metadata the call itself says whether it is another file system.
        if (!plain && info_.st_dev != to_.directory->Status().st_dev) return false;
        if (pending && !DryRun()) {
            SettleBefore(source, target);
            Look(source, target);
        }
        if (sidecars_.problem) throw Failure(*sidecars_.problem);
        if (sidecars_.Any()) RequirePlace(target);
        RequireOwnNames(source, sidecars_);
        if (sidecars_.AnyByName() || old_.AnyByName()) RequireOthersNames(target);
        try {
            Plan(target);
            if (DryRun()) return Foresee();
            PrepareSteps();
            SetAside();
            if (!RenameItself()) {
                TakeBack();
                return false;
            }
        } catch (const Failure&) {
            TakeBack();
            throw;
        }
        // Two names of one file are left as they are.
        if (same_ && !case_only_) (void)from_.directory->RemoveFile(from_.name);
        try {
            PutInPlace();
        } catch (const Failure&) {
            // What has been replaced is gone; the next run goes on from here.
            if ((!there_ || case_only_) && TryToRename(to_, from_)) TakeBack();
            throw;
        }
        RemoveWhatIsOld();
        Conclude(source, target, info_);
        End(target);
        return true;
    }

 private:
    // Beside the objects, or in the EA directory.
    enum Level : std::size_t { kBeside, kInEaDirectory };

    struct Step {
        Found from;
        std::string name;  // that it is to have
        Level level;
        enum { kPlanned, kLinked, kMoved } state = kPlanned;
        bool placed = false;
    };
    struct Aside {
        Pending* pending;
        Part part;
        std::string name;
    };

    void Look(const Object& source, const Object& target) {
        sidecars_ = Sidecars::Find(source, Sidecars::Services::kFind);
        old_ = {};
        if (!case_only_) old_ = Sidecars::Find(target, Sidecars::Services::kFind);
    }

    // ---- What an earlier run has left -----------------------------------------------------------

    // On volumes with EA directories the lists of these say it, also of what is beside objects.
    bool IsAnythingPending() {
        if (ListsPendingOf(sidecars_.ea_dir, info_.st_ino)) return true;
        if (ListsPendingOf(old_.ea_dir, info_.st_ino)) return true;
        if (there_ && ListsPendingOf(old_.ea_dir, there_->st_ino)) return true;
        if (keeping_ != Keeping::kAppleDouble) return false;
        if (from_.directory->Has(OwnerCalled(from_.name).Name())) return true;
        if (to_.directory->Has(OwnerCalled(to_.name).Name())) return true;
        // What this one has may be what the other one had under its former name.
        if (!there_ || !sidecars_.apple_double) return false;
        return to_.directory->Has(ReplacedOwner().Name());
    }

    void SettleBefore(const Object& source, const Object& target) {
        (void)SettleObject(from_, info_);
        // What is there may have been called as this one is now.
        const bool any = there_ && !case_only_ && SettleObject(to_, *there_);
        if (any && !same_) RemoveSecondNames(source, target);
        UndoPending(from_, to_, NewOwner());
        for (const DirectoryRef& ea_dir : {sidecars_.ea_dir, old_.ea_dir}) {
            if (ea_dir) ea_dir->ForgetEntries();
        }
    }

    // ---- Where everything goes ------------------------------------------------------------------

    // The object itself is none of the others.
    void RequireOthersNames(const Object& target) const {
        const auto other = SharesNames(to_);
        if (!other || *other == from_.name) return;
        RequireOwnNames(target);
    }

    // And that nothing but metadata is in its way.
    void Plan(const Object& target) {
        const std::string start = NameInEaDirectory(to_.name);
        const auto add = [&](const std::optional<Found>& found, const std::string& kind) {
            if (found) Add(*found, start + kind, kInEaDirectory);
        };
        add(sidecars_.stream, "@" MAVOEA_KIND_STREAM);
        add(sidecars_.resource, "@" MAVOEA_KIND_RESOURCE);
        add(sidecars_.resource_copy, "@" MAVOEA_KIND_RESOURCE "Tmp");
        for (const Sidecars::Service& service : sidecars_.services) {
            if (service.name.front() == '@') add(service.found, service.name);
        }
        if (sidecars_.folder) {
            Add({sidecars_.ea_dir, from_.name, sidecars_.folder->Status()}, to_.name,
                kInEaDirectory);
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
            Add(*found, name, kBeside);
        }
    }

    Failure InTheWay(const Place& place) const {
        return {kFailed, from_.path(),
                "something is in the way of its metadata at " + Printable(place.path()),
                "see what it is, and move it away"};
    }

    void Add(const Found& found, const std::string& name, Level level) {
        const Place to = {DirectoryAt(level), name};
        const auto info = to.directory ? to.Status() : std::nullopt;
        if (info && (info->st_mode & S_IFMT) != (found.info.st_mode & S_IFMT)) throw InTheWay(to);
        const bool stays = !case_only_ && found.name == name && info && SameFile(*info, found.info);
        if (stays && SameFile(to.directory->Status(), found.directory->Status())) {
            // Two long names may be shortened to the same one.
            kept_.push_back(name);
        } else {
            steps_.push_back({found, name, level});
        }
    }

    // Once there is a pending directory in it, nobody removes an EA directory. Null for one that a
    // dry run would have made.
    DirectoryRef DirectoryAt(Level level) {
        if (level == kBeside) return to_.directory;
        if (const auto& pending = pending_[0][level]) return pending->holder();
        return NeedEaDirectory(*to_.directory);
    }

    // The object, under one of its two names.
    PendingOwner OwnerCalled(const std::string& name) {
        if (!birth_) birth_ = BirthOf(from_);
        return PendingOwner::Of(name, info_.st_ino, *birth_);
    }
    PendingOwner NewOwner() {
        if (!same_ || case_only_) return OwnerCalled(to_.name);
        return PendingOwner::Of(to_.name, info_.st_ino, BirthOf(to_), info_.st_nlink - 1);
    }
    PendingOwner ReplacedOwner() const {
        return PendingOwner::Of(to_.name, there_->st_ino, BirthOf(to_),
                                same_ ? there_->st_nlink : 0);
    }

    // The pending directory there of the object or of the one that it replaces; null where the disk
    // is full.
    Pending* PendingAt(Level level, bool replaced) {
        auto& pending = pending_[replaced ? 1 : 0][level];
        if (pending || full_) return pending.get();
        const PendingOwner owner = replaced ? ReplacedOwner() : NewOwner();
        constexpr int kAttempts = 10;
        for (int attempt = 1; !pending && !full_; ++attempt) {
            try {
                // What an earlier run has left of what is being replaced goes with that.
                bool busy = false;
                if (replaced) pending = Pending::Find(DirectoryAt(level), owner, &busy);
                if (!pending) pending = Pending::Make(DirectoryAt(level), owner);
                full_ = !pending;
            } catch (const SystemFailure& failure) {
                // An EA directory that is empty may go at any time.
                if (failure.status() != kNotFound || attempt == kAttempts) throw;
            }
        }
        return pending.get();
    }

    // That of what lies beside an object, with a sign of it where the next run looks on volumes
    // that have EA directories, see IsAnythingPending().
    Pending* PendingFor(Level level, bool replaced) {
        if (level == kBeside && keeping_ == Keeping::kEaDirectory) {
            try {
                (void)PendingAt(kInEaDirectory, replaced);
            } catch (const Failure&) {
                // Without one it is found by who lists the directory.
            }
        }
        return PendingAt(level, replaced);
    }

    bool Foresee() const {
        if (AreApart(*from_.directory, *to_.directory)) return false;
        int error = to_.name.size() > NAME_MAX ? ENAMETOOLONG : WhyNoRemoval(from_);
        if (error == 0) error = there_ ? WhyNoRemoval(to_) : WhyNoNewFile(*to_.directory);
        // Its ".." becomes another.
        const bool changes =
            S_ISDIR(info_.st_mode) && !SameFile(from_.directory->Status(), to_.directory->Status());
        if (error == 0 && changes) error = WhyNoWriting(from_);
        if (error != 0) throw SystemFailure(from_.path(), error);
        // What this has put beside it goes with it.
        const std::string beside = AppleDoubleName(from_.name);
        const auto* const own = Foreseen::Find(*from_.directory, beside);
        if (own != nullptr && own->is_apple_double) {
            Foreseen::Go(*from_.directory, beside);
            Foreseen::ComeAppleDouble({to_.directory, AppleDoubleName(to_.name)});
        }
        for (const Step& step : steps_) Foreseen::Go(*step.from.directory, step.from.name);
        for (const Found& old : old_.Files()) Foreseen::Go(*old.directory, old.name);
        if (S_ISDIR(info_.st_mode)) {
            const bool holds = !from_.Open()->Entries().empty();
            Foreseen::GoWithAll(*from_.directory, from_.name);
            Foreseen::ComeDirectory(to_, info_, holds);
            return true;
        }
        if (!same_ || case_only_) Foreseen::Come(to_, info_);
        Foreseen::Go(*from_.directory, from_.name);
        return true;
    }

    // ---- Before the object ----------------------------------------------------------------------

    void PrepareSteps() {
        for (Step& step : steps_) {
            Pending* const pending = PendingFor(step.level, false);
            if (pending == nullptr) continue;
            const Place old = {step.from.directory, step.from.name};
            if (!case_only_ && !S_ISDIR(step.from.info.st_mode)) {
                if (pending->TryToLink(old, step.name)) {
                    step.state = Step::kLinked;
                    continue;
                }
                if (errno == ENOENT) continue;  // gone meanwhile
            }
            // There are no hard links here, or not of such files, or not of another user's.
            pending->Move(Part::kMoved, old, step.name);
            step.state = Step::kMoved;
        }
    }

    // Nothing of the replaced object's may be taken for this one's.
    void SetAside() {
        const bool replaced = there_.has_value();
        const Part part = replaced ? Part::kReplaced : Part::kDropped;
        std::vector<Found> in_folder;
        std::vector<Found> found = old_.Files();
        if (old_.folder) found.push_back({old_.ea_dir, to_.name, old_.folder->Status()});
        for (const Found& one : found) {
            const bool beside = one.directory.get() == to_.directory.get();
            if (!beside && one.directory != old_.ea_dir) {
                in_folder.push_back(one);
                continue;
            }
            if (std::find(kept_.begin(), kept_.end(), one.name) != kept_.end()) continue;
            if (!one.directory->Has(one.name)) continue;  // gone meanwhile
            Pending* const pending = PendingFor(beside ? kBeside : kInEaDirectory, replaced);
            if (pending != nullptr) {
                pending->Move(part, {one.directory, one.name}, one.name);
                aside_.push_back({pending, part, one.name});
                continue;
            }
            if (S_ISDIR(one.info.st_mode)) {
                left_.insert(left_.end(), in_folder.begin(), in_folder.end());
            }
            left_.push_back(one);
        }
    }

    // False when that takes a copy. Where two names that differ in case only are one, a rename may
    // change nothing: it takes a third name.
    bool RenameItself() {
        if (!TryToRename(from_, to_)) {
            if (errno == EXDEV) return false;
            throw SystemFailure(from_.path(), errno);
        }
        if (!case_only_ || IsListed(to_) || !IsListed(from_)) return true;
        Pending* const pending = PendingAt(kBeside, false);
        if (pending == nullptr) throw SystemFailure(from_.path(), ENOSPC);
        pending->Move(Part::kMoved, from_, to_.name);
        const Place between = {pending->DirectoryOf(Part::kMoved), to_.name};
        if (TryToRename(between, to_)) return true;
        const int error = errno;
        (void)TryToRename(between, from_);
        throw SystemFailure(from_.path(), error);
    }

    // All is where it was. What cannot be taken back stays for the next run.
    void TakeBack() {
        try {
            for (Step& step : steps_) TakeBack(&step);
            for (const Aside& aside : aside_) {
                const Directory& to = *aside.pending->holder();
                (void)aside.pending->DirectoryOf(aside.part)
                    ->RenameToNew(aside.name, to, aside.name);
            }
            RemovePending();
        } catch (const Failure&) {
            // The caller has one to tell of already.
        }
    }

    static Part PartOf(const Step& step) {
        return step.state == Step::kLinked ? Part::kSecondNames : Part::kMoved;
    }

    void TakeBack(Step* step) {
        Pending* const pending = pending_[0][step->level].get();
        const Place old = {step->from.directory, step->from.name};
        if (pending == nullptr) {
            if (step->placed) {
                (void)DirectoryAt(step->level)->RenameToNew(step->name, *old.directory, old.name);
            }
            return;
        }
        if (step->state == Step::kPlanned) return;
        const DirectoryRef now =
            step->placed ? pending->holder() : pending->DirectoryOf(PartOf(*step));
        const auto there = old.Status();
        if (there && SameFile(*there, step->from.info)) {
            (void)now->RemoveFile(step->name);
        } else {
            (void)now->RenameToNew(step->name, *old.directory, old.name);
        }
    }

    // ---- After it -------------------------------------------------------------------------------

    void PutInPlace() {
        RemoveFiles(left_);
        for (Step& step : steps_) {
            const Place to = {DirectoryAt(step.level), step.name};
            Pending* const pending = pending_[0][step.level].get();
            const Place old = {step.from.directory, step.from.name};
            Place now = old;
            if (step.state != Step::kPlanned) now = {pending->DirectoryOf(PartOf(step)), step.name};
            step.placed = TryToRename(now, to);
            // Without the lock, which not all file systems have, somebody may have been here.
            if (!step.placed && errno == ENOENT) step.placed = TryToRename(old, to);
            if (step.placed || errno == ENOENT) continue;
            throw SystemFailure(now.path(), errno);
        }
    }

    void RemoveWhatIsOld() {
        for (const Level level : {kBeside, kInEaDirectory}) {
            if (const auto& pending = pending_[0][level]) pending->Clear(Part::kDropped);
            if (const auto& pending = pending_[1][level]) pending->Clear();
        }
        std::vector<Found> old;
        for (const Step& step : steps_) {
            if (step.state == Step::kLinked && step.placed) old.push_back(step.from);
        }
        RemoveFiles(old);
    }

    void RemovePending() {
        for (Levels* const levels : {&pending_[1], &pending_[0]}) {
            for (const Level level : {kBeside, kInEaDirectory}) {
                if (const auto& pending = (*levels)[level]) (void)pending->Remove();
            }
        }
    }

    void End(const Object& target) {
        if (!steps_.empty() && sidecars_.ea_dir) RemoveEaDirectoryIfEmpty(*from_.directory);
        RemovePending();
        if (!aside_.empty() || !left_.empty()) RemoveEmptyDirectories(target, old_);
        const bool in_ea_directory =
            std::any_of(steps_.begin(), steps_.end(),
                        [](const Step& step) { return step.level == kInEaDirectory; });
        if (pending_[0].in_ea_directory && !in_ea_directory) {
            RemoveEaDirectoryIfEmpty(*to_.directory);
        }
    }

    const Place& from_;
    const Place& to_;
    const struct stat info_;
    const std::optional<struct stat> there_;
    std::optional<std::uint64_t> birth_;
    Keeping keeping_ = Keeping::kNone;
    bool same_ = false;       // two names of one file
    bool case_only_ = false;  // of which one is listed
    bool full_ = false;       // the disk has no room for pending directories

    Sidecars sidecars_;
    Sidecars old_;
    std::vector<Step> steps_;
    std::vector<std::string> kept_;  // in the EA directory, under the same name
    std::vector<Aside> aside_;
    std::vector<Found> left_;  // in the way, where they could not be set aside
    struct Levels {
        std::unique_ptr<Pending> beside;
        std::unique_ptr<Pending> in_ea_directory;

        std::unique_ptr<Pending>& operator[](Level level) {
            return level == kBeside ? beside : in_ea_directory;
        }
    };
    Levels pending_[2];  // of the object, and of the one that it replaces
};

}  // namespace

bool RenameObject(const Place& from, const Place& to) { return Renaming(from, to).Run(); }

bool FinishRename(const Place& from, const Place& to) {
    if (!SettlePending(to.directory, to.name)) return false;
    const auto info = to.Status();
    if (!info) return false;
    const Object source = ObjectAt(from, &*info);
    const Object target = ObjectAt(to, &*info);
    RemoveSecondNames(source, target);
    Conclude(source, target, *info);
    return true;
}

}  // namespace mavoea::tool

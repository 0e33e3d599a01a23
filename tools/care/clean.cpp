#include "tools/care/clean.h"

#include <poll.h>
#include <sys/resource.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <iostream>
#include <memory>

#include "include/mavoea.h"
#include "tools/care/dangling.h"
#include "tools/place/dry_run.h"
#include "tools/place/volume.h"
#include "tools/say/interrupt.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

constexpr std::size_t kMostWaiting = 4096;  // that are found before they are looked at again

// What becomes of something that was found; it may have gone meanwhile, or not dangle any more.
enum class Fate { kFound, kKept, kRemoved, kGone };

// The end of what dangles in one directory.
//
// Nothing that is removed can be brought back, and what is looked at can be exchanged before it is
// removed. So a thing goes to a directory first where nobody else has any business, and is looked
// at there: if it is another one than was found, or its object has come, it goes back. What a run
// that is killed leaves there the next one puts back as well, and looks at anew.
class Removal {
 public:
    explicit Removal(DirectoryRef directory) : directory_(std::move(directory)) {}

    // Throws Failure.
    Fate Remove(const Dangling& dangling) {
        if (DryRun()) return Foresee(dangling);
        switch (dangling.kind) {
            case DanglingKind::kTemporary:
                return RemoveAbandoned(*dangling.holder, dangling.name) ? Fate::kRemoved
                                                                        : Fate::kGone;
            case DanglingKind::kPending:
                return Settle(dangling);
            case DanglingKind::kEaDirectory:
                End();
                return RemoveEaDirectory(dangling) ? Fate::kRemoved : Fate::kGone;
            default:
                return TakeAndRemove(dangling);
        }
    }

    // Nothing is left of the directories for what goes.
    void End() {
        for (const auto& taken : taken_) (void)taken->Remove();
        taken_.clear();
    }

 private:
    Fate Foresee(const Dangling& dangling) const {
        const bool is_directory = dangling.kind == DanglingKind::kEaDirectory;
        if (is_directory && !HasOnlyCover(dangling)) return Fate::kGone;
        const int error = WhyNoRemoval({dangling.holder, dangling.name});
        if (error != 0) throw SystemFailure(dangling.holder->PathOf(dangling.name), error);
        Foreseen::Go(*dangling.holder, dangling.name);
        return Fate::kRemoved;
    }

    Fate Settle(const Dangling& dangling) const {
        const auto owner = PendingOwner::Parse(dangling.name);
        if (!owner) return Fate::kGone;
        if (!SettlePendingDirectory(directory_, dangling.holder, *owner)) return Fate::kKept;
        RemoveEaDirectoryIfEmpty(*directory_);
        return Fate::kRemoved;
    }

    // Unless something has come into it, or could not be removed.
    bool RemoveEaDirectory(const Dangling& dangling) const {
        if (!HasOnlyCover(dangling)) return false;
        const DirectoryRef ea_dir = directory_->FindIn(dangling.name);
        if (ea_dir) (void)ea_dir->RemoveFile(kCoverName);
        return directory_->RemoveEmpty(dangling.name);
    }

    bool HasOnlyCover(const Dangling& dangling) const {
        const DirectoryRef ea_dir = directory_->FindIn(dangling.name);
        if (!ea_dir) return false;
        const auto entries = ea_dir->Entries();
        return std::all_of(entries.begin(), entries.end(), [](const auto& entry) {
            return entry.name == kCoverName && S_ISREG(entry.type);
        });
    }

    Fate TakeAndRemove(const Dangling& dangling) {
        const Directory& holder = *dangling.holder;
        Pending* const taken = TakenFrom(dangling);
        if (taken == nullptr) {  // The disk is full.
            if (HasObject(*directory_, dangling)) return Fate::kGone;
            return holder.Remove(dangling.name) ? Fate::kRemoved : Fate::kGone;
        }
        const DirectoryRef& in = taken->DirectoryOf(Pending::Part::kSecondNames);
        try {
            holder.Rename(dangling.name, *in, dangling.name);
        } catch (const SystemFailure& failure) {
            if (failure.status() == kNotFound) return Fate::kGone;
            throw;
        }
        const auto info = in->StatusOf(dangling.name);
        if (!info || !SameFile(*info, dangling.info) || HasObject(*directory_, dangling)) {
            // What has come to its place by now takes that.
            if (!in->RenameToNew(dangling.name, holder, dangling.name)) {
                (void)in->Remove(dangling.name);
            }
            return Fate::kGone;
        }
        return in->Remove(dangling.name) ? Fate::kRemoved : Fate::kGone;
    }

    Pending* TakenFrom(const Dangling& dangling) {
        for (const auto& taken : taken_) {
            if (taken->holder() == dangling.holder) return taken.get();
        }
        try {
            auto taken = Pending::Make(dangling.holder, PendingOwner::Nobody());
            if (!taken) return nullptr;
            return taken_.emplace_back(std::move(taken)).get();
        } catch (const SystemFailure& failure) {
            throw SystemFailure(dangling.holder->PathOf(dangling.name), failure.error());
        }
    }

    DirectoryRef directory_;
    std::vector<std::unique_ptr<Pending>> taken_;
};

class Cleaning {
 public:
    explicit Cleaning(const CleanOptions& options) : options_(options) {}

    void Do(const std::string& path) {
        try {
            const Place top = FindObject(path).place;
            RefuseEaDirectory(top.path());
            const auto info = top.Status();
            if (info && !S_ISDIR(info->st_mode)) throw SystemFailure(top.path(), ENOTDIR);
            DoDirectory(top);
        } catch (const Failure& failure) {
            Add(path, failure);
        }
        // No depth takes more than the heap.
        while (!pending_.empty() && Interrupted() == 0) {
            const Place place = std::move(pending_.back());
            pending_.pop_back();
            try {
                DoDirectory(place);
            } catch (const Failure& failure) {
                // Nothing is wrong with what has gone meanwhile.
                if (failure.status() == kNotFound && !place.directory->Has(place.name)) continue;
                Add(place.path(), failure);
            }
        }
        pending_.clear();
    }

    void Fail(const Failure& failure) { Add(failure.subject(), failure); }

    ExitStatus Finish() {
        if (!looked_.empty() && Interrupted() == 0) LookAgain();
        if (options_.json) {
            PrintJson();
        } else {
            std::cout << (options_.remove ? removed_ : dangling_)
                      << (options_.remove ? " removed, " : " to be removed with --yes, ") << kept_
                      << " kept, " << failures_.size() << " failed\n";
        }
        for (const FailedObject& failed : failures_) Report(failed.message);
        if (Interrupted() == 0) return status_;
        Report("interrupted: what is left is as it was, give the command again");
        constexpr int kSignalled = 128;
        return static_cast<ExitStatus>(kSignalled + Interrupted());
    }

 private:
    // What is in there is metadata, whatever its name.
    static void RefuseEaDirectory(const std::string& path) {
        for (const std::filesystem::path& component : std::filesystem::path(path)) {
            if (component == "@eaDir") {
                throw Failure(kFailed, path, "in an EA directory",
                              "name a directory that holds objects");
            }
        }
    }

    void DoDirectory(const Place& place) {
        if (progress_.wanted()) ShowProgress(place.path());
        const DirectoryRef directory = place.directory->OpenIn(place.name);
        Looked looked = Look(directory);
        if (options_.remove && !DryRun() && GiveBack(looked)) looked = Look(directory);
        const bool any_goes = std::any_of(looked.found.begin(), looked.found.end(),
                                          [this](const Dangling& one) { return !Stays(one); });
        if (!options_.remove || !any_goes) {
            for (const Dangling& dangling : looked.found) List(dangling, Fate::kFound);
        } else {
            waiting_ += looked.found.size();
            looked_.push_back(std::move(looked));
            if (waiting_ >= kMostWaiting || looked_.size() >= MostOpen()) LookAgain();
        }
        ++directories_;
        if (!options_.recursive) return;
        const std::size_t first = pending_.size();
        for (const Directory::Entry& entry : directory->Entries()) {
            if (S_ISDIR(entry.type) && MAVOEAIsHiddenDirName(entry.name.c_str()) == 0 &&
                !PendingOwner::Parse(entry.name)) {
                pending_.push_back({directory, entry.name});
            }
        }
        std::reverse(pending_.begin() + static_cast<std::ptrdiff_t>(first), pending_.end());
    }

    void ShowProgress(const std::string& path) {
        progress_.Show(std::to_string(directories_) + " directories, " +
                           std::to_string(dangling_ + waiting_) + " found, " +
                           std::to_string(removed_) + " removed, " +
                           std::to_string(failures_.size()) + " failed",
                       path, directories_);
    }

    // ---- Looking --------------------------------------------------------------------------------

    bool Stays(const Dangling& dangling) const {
        return dangling.kind == DanglingKind::kOther && !options_.others;
    }

    struct Looked {
        DirectoryRef directory;
        std::vector<Dangling> found;
    };

    Looked Look(const DirectoryRef& directory) const {
        const auto info = directory->StatusOf(kEaDirName);
        const DirectoryRef ea_dir =
            info && S_ISDIR(info->st_mode) ? directory->FindIn(kEaDirName) : nullptr;
        return {directory, FindDangling(directory, ea_dir, options_.others)};
    }

    // What an earlier run was about to remove is looked at as ever. Whether there was any.
    static bool GiveBack(const Looked& looked) {
        bool any = false;
        for (const Dangling& dangling : looked.found) {
            if (dangling.kind != DanglingKind::kPending) continue;
            const auto owner = PendingOwner::Parse(dangling.name);
            if (!owner || owner->inode != 0) continue;
            (void)SettlePendingDirectory(looked.directory, dangling.holder, *owner);
            any = true;
        }
        return any;
    }

    // Each of them keeps two directories open.
    static std::size_t MostOpen() {
        constexpr rlim_t kLeast = 16;
        rlimit limit{};
        if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return kLeast;
        return static_cast<std::size_t>(
            std::clamp<rlim_t>(limit.rlim_cur / 8, kLeast, kMostWaiting));
    }

    // ---- Looking again --------------------------------------------------------------------------

    // A service that renames an object and then its metadata, or the metadata first, may be just
    // between the two: what dangles then does not dangle, or has changed, when it is looked at
    // again.
    void LookAgain() {
        const std::vector<Looked> looked = std::move(looked_);
        looked_.clear();
        if (!Wait()) return;
        waiting_ = 0;
        for (const Looked& before : looked) {
            try {
                Remove(before);
            } catch (const Failure& failure) {
                if (failure.status() != kNotFound) Add(before.directory->path(), failure);
            }
        }
    }

    // False when it has been interrupted.
    bool Wait() {
        using std::chrono::steady_clock;
        constexpr int kStep = 50;  // milliseconds
        Progress progress("cleaning");
        const auto end = steady_clock::now() + std::chrono::seconds(options_.wait);
        while (Interrupted() == 0) {
            const auto left =
                std::chrono::duration_cast<std::chrono::milliseconds>(end - steady_clock::now());
            if (left.count() <= 0) return true;
            progress.Show("looking again in " + std::to_string((left.count() + 999) / 1000) + " s",
                          std::to_string(waiting_) + " found");
            (void)::poll(nullptr, 0, static_cast<int>(std::min<std::int64_t>(left.count(), kStep)));
        }
        return false;
    }

    // A rename or another name changes the time of an inode.
    static bool IsUnchanged(const Dangling& before, const Dangling& now) {
        return before.kind == now.kind && before.name == now.name &&
               SameFile(before.info, now.info) &&
               before.info.st_ctim.tv_sec == now.info.st_ctim.tv_sec &&
               before.info.st_ctim.tv_nsec == now.info.st_ctim.tv_nsec;
    }

    void Remove(const Looked& before) {
        const Looked now = Look(before.directory);
        Removal removal(before.directory);
        for (const Dangling& dangling : now.found) {
            const auto same =
                std::find_if(before.found.begin(), before.found.end(),
                             [&](const Dangling& one) { return IsUnchanged(one, dangling); });
            if (same == before.found.end()) continue;
            const std::string path = dangling.holder->PathOf(dangling.name);
            try {
                const Fate fate = Stays(dangling) ? Fate::kKept : removal.Remove(dangling);
                if (fate != Fate::kGone) List(dangling, fate);
            } catch (const Failure& failure) {
                Add(path, failure);
            }
        }
        removal.End();
    }

    // ---- What is said ---------------------------------------------------------------------------

    void List(const Dangling& dangling, Fate fate) {
        if (Stays(dangling)) fate = Fate::kKept;
        const bool kept = fate == Fate::kKept;
        const bool removed = fate == Fate::kRemoved;
        ++(kept ? kept_ : removed ? removed_ : dangling_);
        const std::string path = dangling.holder->PathOf(dangling.name);
        if (!options_.json) {
            std::cout << Printable(path) << ": " << LabelOf(dangling.kind) << ", "
                      << dangling.because
                      << (kept      ? "; kept"
                          : removed ? "; removed"
                                    : "")
                      << '\n';
            return;
        }
        Json entry;
        entry.SetText("path", path);
        entry.Set("kind", IdOf(dangling.kind));
        entry.Set("reason", dangling.because);
        entry.Set("kept", kept);
        entry.Set("removed", removed);
        list_.Add(std::move(entry));
    }

    void Add(const std::string& path, const Failure& failure) {
        failures_.push_back({path, failure.what()});
        status_ = std::max(status_, failure.status());
    }

    void PrintJson() const {
        Json json;
        json.Set("found", list_);
        json.Set("dangling", dangling_);
        json.Set("removed", removed_);
        json.Set("kept", kept_);
        json.Set("failed", failures_.size());
        SetFailures(json, failures_);
        Print(json);
    }

    const CleanOptions& options_;
    Progress progress_{"looking for metadata", Progress::Lines::kOnRequest};
    std::vector<Place> pending_;   // directories
    std::size_t directories_ = 0;  // that have been looked through
    std::vector<Looked> looked_;   // of which something waits for the second look
    std::size_t waiting_ = 0;      // how many things that is
    Json list_ = Json::Array();
    std::size_t dangling_ = 0;  // neither removed nor kept
    std::size_t removed_ = 0;
    std::size_t kept_ = 0;
    std::vector<FailedObject> failures_;
    ExitStatus status_ = kSuccess;
};

}  // namespace

ExitStatus Clean(const CleanOptions& options) {
    if (options.recursive) RequireDescriptorPaths();
    WatchForInterrupts();
    Cleaning cleaning(options);
    PathReader directories(options.directories,
                           [&](const Failure& failure) { cleaning.Fail(failure); });
    while (const auto directory = Interrupted() == 0 ? directories.Next() : std::nullopt) {
        cleaning.Do(*directory);
    }
    return cleaning.Finish();
}

}  // namespace mavoea::tool

#include "tools/move/copy.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <set>
#include <tuple>
#include <utility>
#include <vector>

#include "tools/move/ends.h"
#include "tools/move/parents.h"
#include "tools/move/same_file.h"
#include "tools/move/unfinished.h"
#include "tools/place/dry_run.h"
#include "tools/place/paths.h"
#include "tools/place/volume.h"
#include "tools/say/interrupt.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"
#include "tools/transfer/removal.h"
#include "tools/transfer/rename.h"
#include "tools/transfer/transfer.h"
#include "tools/transfer/tree_copy.h"

namespace mavoea::tool {
namespace {

constexpr const char* kElsewhere = "name another destination";

JobOptions WithSourcesOnly(const CopyOptions& options) {
    JobOptions job = options.job;
    if (!options.target_directory) job.paths.pop_back();  // of a list, nothing is left
    return job;
}

// "0644 (rw-r--r--)", for a question.
std::string ModeText(mode_t mode) {
    constexpr char kLetters[] = "rwxrwxrwx";
    std::string letters = "---------";
    for (std::size_t i = 0; i < letters.size(); ++i) {
        if ((mode >> (letters.size() - 1 - i) & 1) != 0) letters[i] = kLetters[i];
    }
    const auto put = [&](mode_t bit, std::size_t at, char with, char without) {
        if ((mode & bit) != 0) letters[at] = letters[at] == 'x' ? with : without;
    };
    put(S_ISUID, 2, 's', 'S');
    put(S_ISGID, 5, 's', 'S');
    put(S_ISVTX, 8, 't', 'T');
    std::string digits = "0000";
    for (std::size_t i = 0; i < digits.size(); ++i) {
        digits[i] = static_cast<char>('0' + (mode >> (9 - 3 * i) & 7));
    }
    return digits + " (" + letters + ')';
}

// What is there is left alone in that of directories as well.
Merging MergingOf(Task task, const CopyOptions& options) {
    if (task != Task::kCopy) return Merging::kReplaces;
    const bool keeps = options.update || options.overwrite == Overwrite::kNever;
    return keeps ? Merging::kKeeps : Merging::kAdds;
}

class Placement final : private TreeCopy {
 public:
    Placement(Task task, const CopyOptions& options)
        : task_(task),
          options_(options),
          job_options_(WithSourcesOnly(options)),
          job_(Copies() ? "copying" : "moving", Copies() ? "copied" : "moved", job_options_),
          transfer_({.watch = {.on_bytes = [this](std::uint64_t size) { job_.AddBytes(size); },
                               .give_up = InterruptedAgain},
                     .on_note = [this](const std::string& note) { job_.AddNote(note); },
                     .manner = options.manner,
                     .merging = MergingOf(task, options),
                     .remembers = !Copies()}) {}

    ExitStatus Run() {
        if (job_options_.recursive) RequireDescriptorPaths();
        FindDestination();
        const NamedPaths sources = {job_options_.paths, job_options_.list};
        PathReader reader(sources, [this](const Failure& failure) {
            job_.AddFailure(failure.subject(), failure);
        });
        while (const auto source = job_.stopped() ? std::nullopt : reader.Next()) {
            (void)Try(*source, [&] { PlaceNamed(*source); });
        }
        FinishMoves();
        if (Copies()) (void)MakeDurable();
        return job_.Finish();
    }

 private:
    using Entry = std::tuple<ino_t, dev_t, std::string>;

    static Entry EntryOf(const Place& place) {
        const struct stat directory = place.directory->Status();
        return {directory.st_ino, directory.st_dev, place.name};
    }

    bool Copies() const { return task_ == Task::kCopy; }
    bool Recursive() const { return job_options_.recursive; }
    bool Named() const { return levels().empty(); }

    // Whether a link of the source is followed.
    bool Follows() const {
        switch (options_.follow) {
            case Follow::kNever:
                return false;
            case Follow::kNamed:
                return Named();
            case Follow::kAlways:
                return true;
            case Follow::kUsual:
                break;
        }
        return Copies() && (!Recursive() || options_.hard_links);
    }

    // Whether what is no regular file is read, and not made anew.
    bool ReadsContents() const { return Copies() && (!Recursive() || options_.copy_contents); }

    // ---- Where to -------------------------------------------------------------------------------

    void FindDestination() {
        if (options_.target_directory) {
            const std::string& path = *options_.target_directory;
            const auto info = RequireStatus("target directory " + Quoted(path), path);
            if (!info) throw Refusal("target directory " + Quoted(path), ENOENT);
            if (!S_ISDIR(info->st_mode)) throw Refusal("target directory " + Quoted(path), ENOTDIR);
            directory_ = DirectoryAt(path);
            return;
        }
        const std::string& path = options_.job.paths.back();
        const bool several = job_options_.several();
        const auto info =
            options_.no_target_directory
                ? std::nullopt
                : RequireStatus((several ? "target " : "cannot stat ") + Quoted(path), path);
        const bool respelled = !Copies() && !several && IsRespelled(path);
        if (info && S_ISDIR(info->st_mode) && !respelled) {
            directory_ = DirectoryAt(path);
            return;
        }
        if (several) throw Refusal("target " + Quoted(path), info ? ENOTDIR : ENOENT);
        if (options_.parents) {
            throw Refusal("with --parents, the destination must be a directory",
                          "name a directory that is there");
        }
        destination_ = DestinationAt(path);
    }

    static std::optional<struct stat> RequireStatus(const std::string& what,
                                                    const std::string& path) {
        try {
            return StatusBehind(path);
        } catch (const SystemFailure& failure) {
            // A link that leads to itself is replaced with --force, and refused later without.
            if (failure.error() == ELOOP) return std::nullopt;
            throw Refusal(what, failure.error());
        }
    }

    Place DestinationAt(const std::string& path) const {
        try {
            Place place = PlaceOf(path, Shown::kAsGiven);
            place.shown = path;
            return place;
        } catch (const SystemFailure& failure) {
            throw Refusal(Making(path), failure.error());
        }
    }

    // What cannot be done where the destination's directory is not there.
    std::string Making(const std::string& path) const {
        const std::string& source = job_options_.paths.front();
        if (!Copies()) return "cannot move " + Quoted(source) + " to " + Quoted(path);
        struct stat info;
        const bool directory = ::stat(source.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
        if (directory) return "cannot create directory " + Quoted(path);
        if (options_.hard_links) {
            return "cannot create hard link " + Quoted(path) + " to " + Quoted(source);
        }
        return std::string("cannot create ") +
               (options_.symbolic_links ? "symbolic link " : "regular file ") + Quoted(path) +
               (options_.symbolic_links ? " to " + Quoted(source) : "");
    }

    // Whether both are one directory on a file system that ignores case, and spelled otherwise.
    bool IsRespelled(const std::string& path) const {
        try {
            const Place from = PlaceOf(job_options_.paths.front(), Shown::kAsGiven);
            const Place to = PlaceOf(path, Shown::kAsGiven);
            const auto info = from.Status();
            const auto there = to.Status();
            return info && there && S_ISDIR(info->st_mode) && SameFile(*info, *there) &&
                   !SamePlace(from, to);
        } catch (const Failure&) {
            return false;  // said where it matters
        }
    }

    static DirectoryRef DirectoryAt(const std::string& path) {
        return Directory::Open(
            path, path, std::filesystem::absolute(path + "/.").lexically_normal().parent_path());
    }

    Place TargetOf(const std::string& source) {
        if (destination_) return *destination_;
        if (options_.parents) return parents_.Make(&transfer_, source, directory_);
        const std::string name = LastName(source);
        // The contents of such a directory are what is copied.
        if (name != "." && name != ".." && name != "/") return {directory_, name};
        Place place = PlaceOf(directory_->ProcPath() + "/.", Shown::kWhole);
        place.shown = directory_->path();
        if (name == ".") place.shown += place.shown.ends_with('/') ? "." : "/.";
        return place;
    }

    // ---- One object that was named --------------------------------------------------------------

    void PlaceNamed(const std::string& given) {
        std::string path = given;
        while (options_.strip_slashes && path.size() > 1 && path.back() == '/') path.pop_back();
        Place from = NamedPlace(path);
        const bool directory_only = path.ends_with('/');
        const auto info = WouldBeGone(from) ? std::nullopt : from.Status();
        if (!info && !Copies() && FinishMove(from, path)) return;
        if (!info) throw Refusal("cannot stat " + Quoted(path), ENOENT);
        if (directory_only && !S_ISDIR(info->st_mode)) {
            throw Refusal("cannot stat " + Quoted(path), ENOTDIR);
        }
        from.shown = path;
        if (!Copies()) return MoveNamed(from, *info, path);
        const Place to = TargetOf(path);
        CopyTree(from, to);
        if (options_.parents) parents_.Finish(&transfer_);
    }

    // What an earlier run that was killed has moved, but for its end.
    bool FinishMove(const Place& from, const std::string& path) {
        std::vector<Place> targets = {TargetOf(path)};
        // A directory may have become the one that is named as the destination.
        if (!destination_ && !options_.target_directory && job_options_.paths.size() == 1) {
            targets.push_back(PlaceOf(options_.job.paths.back(), Shown::kAsGiven));
        }
        for (const Place& to : targets) {
            const auto began = UnfinishedMove::RemovalBegan(to);
            if (began && to.Status()) {
                RemoveLeftMetadata(from, *began);
                UnfinishedMove::Forget(to);
            } else if (!FinishRename(from, to)) {
                continue;
            }
            job_.AddDone();
            job_.Say("renamed " + Quoted(path) + " -> " + Quoted(to.path()));
            return true;
        }
        return false;
    }

    static Place NamedPlace(const std::string& path) {
        try {
            if (path.empty()) throw SystemFailure(path, ENOENT);
            return PlaceOf(path, Shown::kAsGiven);
        } catch (const SystemFailure& failure) {
            throw Refusal("cannot stat " + Quoted(path), failure.error());
        }
    }

    // ---- One object, named or in a directory ----------------------------------------------------

    bool Stopped() const override { return job_.stopped(); }

    void Fail(const Place& from, const Failure& failure) override {
        job_.AddFailure(from.path(), failure);
        if (dynamic_cast<const Loss*>(&failure) != nullptr) ++losses_;
    }

    void Begin(const Place& from, const Place& to, Level* level) override {
        job_.ShowProgress(from.path());
        const bool follows = Follows();
        Source source = FindSource(from, follows);
        if (source.is_directory() && !source.stream && Copies() && !Recursive()) {
            throw Refusal("-r not specified; omitting directory " + Quoted(from.path()), "use -r");
        }
        if (Named() && Copies() && IsNamedAgain(source, to)) return;
        Target target = FindTarget(to, FollowsTarget(source), options_.force);
        if (Copies() && options_.backup == Backup::kNone && transfer_.HasMadeLink(to)) {
            throw Refusal("will not copy " + Quoted(from.path()) +
                              " through just-created symlink " + Quoted(to.path()),
                          "give it another name");
        }
        // In what is entered that has been done for all.
        if (Named() && target.own) (void)SettleObject(target.named, *target.own);
        const bool merges = source.is_directory() && target.is_directory();
        if (source.is_directory()) RequireApart(source, to);
        const auto taken = std::exchange(taken_, std::nullopt);
        std::string backup = taken.value_or("");
        if (!taken && !MakeWay(source, &target, follows, &backup)) return;
        if (source.is_directory()) {
            Enter(source, target, merges, level);
        } else {
            CopyOne(&source, target);
        }
        Say(source, target, merges, backup);
        if (!source.is_directory()) CountDone();
    }

    void Finish(const Level& level) override {
        transfer_.FinishDirectory(level.from, *level.inside, level.to, level.made, level.is_new);
        CountDone();
    }

    void CountDone() {
        if (Copies()) job_.AddDone();
    }

    bool Leave() {
        if (!job_.stopped()) job_.AddSkipped();
        return false;
    }

    // A name that was given twice, and goes to one place.
    bool IsNamedAgain(const Source& source, const Place& to) {
        if (!job_options_.several()) return false;
        const bool first = named_.insert({EntryOf(source.named), EntryOf(to)}).second;
        if (first || (options_.backup != Backup::kNone && !source.is_directory())) return false;
        job_.AddWarning(std::string("source ") + (source.is_directory() ? "directory " : "file ") +
                        Quoted(source.named.path()) + " specified more than once");
        return true;
    }

    // Whether a link at the destination is followed: where data is written.
    bool FollowsTarget(const Source& source) const {
        const bool writes =
            S_ISREG(source.info.st_mode) || source.stream ||
            (ReadsContents() && !S_ISLNK(source.info.st_mode) && !source.is_directory());
        return Copies() && writes && !options_.hard_links && !options_.symbolic_links &&
               options_.backup == Backup::kNone && !options_.remove_destination;
    }

    // A directory goes neither into itself nor into what it is in already.
    void RequireApart(const Source& source, const Place& to) const {
        for (const Level& level : levels()) {
            if (!SameFile(level.info, source.info)) continue;
            throw Refusal("cannot copy cyclic symbolic link " + Quoted(source.named.path()),
                          "copy it with -P");
        }
        const auto there = to.Status();
        const bool is_target = there && SameFile(*there, source.info);
        if (!Named() || is_target || !IsInside(to, source.info)) return;
        throw Refusal("cannot copy a directory, " + Quoted(source.named.path()) +
                          ", into itself, " + Quoted(to.path()),
                      kElsewhere);
    }

    static Refusal AreTheSame(const Place& from, const Place& to) {
        return {Quoted(from.path()) + " and " + Quoted(to.path()) + " are the same file",
                kElsewhere};
    }

    // ---- What is in the way ---------------------------------------------------------------------

    // Of what is there. False when nothing is to be done; *backup is where it is kept, if it is.
    bool MakeWay(const Source& source, Target* target, bool follows, std::string* backup) {
        if (!target->info) return true;
        const bool merges = source.is_directory() && target->is_directory();
        if (!merges || options_.backup != Backup::kNone) {
            transfer_.RequireNoMetadataAt(target->named, source.named);
        }
        if (LeavesAlone(source)) return Leave();
        switch (CompareEnds(source, *target, task_, options_, follows)) {
            case Sameness::kSame:
                throw AreTheSame(source.named, target->named);
            case Sameness::kNothing:
                return false;
            case Sameness::kApart:
                break;
        }
        if (!MayTake(source, *target)) return Leave();
        RequireLikeTypes(source, *target);
        *backup = MakeBackup(source, target);
        return true;
    }

    // Whether nothing is to be said of what is there, even if it is the source itself.
    bool LeavesAlone(const Source& source) const {
        return options_.overwrite == Overwrite::kNever && !(Copies() && source.is_directory());
    }

    // False when it is left as it is.
    bool MayTake(const Source& source, const Target& target) {
        const struct stat& there = *target.info;
        const bool directory = source.is_directory();
        if (options_.update && !directory && !IsBefore(there.st_mtim, source.info.st_mtim)) {
            if (Copies()) transfer_.TakeForCopy(source.place, target.place, LinksOf(source));
            return false;
        }
        if (Copies() && directory) return true;  // they are merged
        switch (options_.overwrite) {
            case Overwrite::kNever:
                return false;
            case Overwrite::kAsk:
                break;
            case Overwrite::kAlways:
                return true;
            case Overwrite::kUsual:
                if (Copies() || ::isatty(STDIN_FILENO) != 1 || target.place.Writable()) return true;
        }
        return DryRun() || (job_.Ask(QuestionAbout(target)) && !job_.stopped());
    }

    std::string QuestionAbout(const Target& target) const {
        const std::string name = Quoted(target.named.path());
        if (target.place.Writable()) return "overwrite " + name + '?';
        const std::string mode = ModeText(target.info->st_mode);
        if (!Copies() || options_.remove_destination || options_.force) {
            return "replace " + name + ", overriding mode " + mode + '?';
        }
        std::string unwritable = "unwritable " + name + " (mode " + mode;
        unwritable.replace(unwritable.rfind(" ("), 2, ", ");
        return unwritable + "; try anyway?";
    }

    void RequireLikeTypes(const Source& source, const Target& target) const {
        const bool moves_away = !Copies() && options_.backup != Backup::kNone;
        if (!source.is_directory() && target.is_directory() && !moves_away) {
            throw Refusal(
                "cannot overwrite directory " + Quoted(target.named.path()) + " with non-directory",
                "move it away");
        }
        if (source.is_directory() && !target.is_directory() && !moves_away) {
            throw Refusal("cannot overwrite non-directory " + Quoted(target.named.path()) +
                              " with directory " + Quoted(source.named.path()),
                          "move it away");
        }
        if (Named() && options_.backup != Backup::kNumbered && !source.is_directory()) {
            transfer_.RequireNotMade(source.named, target.named);
        }
    }

    // What is there gets another name, which is returned as it is shown.
    std::string MakeBackup(const Source& source, Target* target) {
        const std::string last = LastName(source.named.path());
        if (options_.backup == Backup::kNone || last == "." || last == "..") return {};
        if (Copies() && target->is_directory()) return {};
        const Place& there = target->named;
        Place to = {there.directory, BackupName(there, options_.backup, options_.suffix)};
        std::string shown = there.path();
        while (shown.size() > 1 && shown.back() == '/') shown.pop_back();
        shown.replace(shown.size() - there.name.size(), there.name.size(), to.name);
        to.shown = shown;
        const auto own = to.Status();
        if (options_.backup != Backup::kNumbered && own && SameFile(*own, source.own) &&
            SamePlace(source.named, to)) {
            throw Refusal("backing up " + Quoted(there.path()) + " might destroy source;  " +
                              Quoted(source.named.path()) +
                              (Copies() ? " not copied" : " not moved"),
                          "use --backup=numbered");
        }
        try {
            if (!transfer_.Rename(there, to)) throw SystemFailure(there.path(), EXDEV);
        } catch (const SystemFailure& failure) {
            throw Refusal("cannot backup " + Quoted(there.path()), failure.error());
        }
        *target = {there, there};
        return shown;
    }

    // ---- Copying --------------------------------------------------------------------------------

    void Enter(const Source& source, const Target& target, bool merges, Level* level) {
        level->inside = source.place.Open();
        if (!Copies()) (void)SettlePending(level->inside);
        level->info = source.info;
        level->is_new = !merges;
        level->from = source.place;
        level->to = target.place;
        const DirectoryRef made = transfer_.MakeDirectory(source.place, target.place);
        if (merges) (void)SettlePending(made);
        if (!SameFile(level->inside->Status(), source.info)) {
            throw HasBecomeAnother(source.place);
        }
        if (!Copies() && removal_began_) {
            RemoveLeftMetadata(level->inside, *made, *removal_began_);
        }
        const bool elsewhere = options_.one_file_system && !Named() &&
                               source.info.st_dev != levels().front().info.st_dev;
        if (!elsewhere) level->entries = CandidatesIn(level->inside);
        level->made = made;
    }

    void CopyOne(Source* source, const Target& target) {
        const Place& to = target.place;
        if (options_.symbolic_links) return MakeLink(*source, target);
        if (options_.hard_links) return LinkOne(*source, target);
        const bool contents = source->stream || S_ISREG(source->info.st_mode) ||
                              (ReadsContents() && !S_ISLNK(source->info.st_mode));
        if (!S_ISREG(source->info.st_mode) && contents && !source->stream) OpenStream(source);
        if (target.dangling) return WriteThrough(*source, target);
        const bool stays = target.info && !Replaces(*source, target);
        const bool may_write = stays && contents;
        if (!may_write || !S_ISREG(target.info->st_mode)) {
            if (may_write && !S_ISDIR(target.info->st_mode)) return Feed(source, target);
            if (stays) {
                throw Refusal("cannot create " + std::string(NameOfType(source->info)) + ' ' +
                                  Quoted(to.path()),
                              EEXIST);
            }
            if (target.info && options_.remove_destination && Copies()) {
                job_.Say("removed " + Quoted(to.path()));
            }
            return Make(*source, to);
        }
        std::unique_ptr<const File> file;
        try {
            file = OpenTarget(target);
        } catch (const Refusal&) {
            if (!options_.force) throw;
            job_.Say("removed " + Quoted(to.path()));
        }
        if (!file) return Make(*source, to);
        transfer_.Overwrite(source->place, source->stream.get(), to, *file, LinksOf(*source));
    }

    void Make(const Source& source, const Place& to) {
        if (to.path().ends_with('/')) {
            throw Refusal("cannot create regular file " + Quoted(to.path()), ENOTDIR);
        }
        if (source.stream) return transfer_.CopyContents(source.place, *source.stream, to);
        transfer_.CopyObject(source.place, source.info.st_mode, to, LinksOf(source));
    }

    Links LinksOf(const Source& source) const {
        if (!options_.keeps_links || source.stream) return Links::kNone;
        return Follows() ? Links::kAll : Links::kSeveral;
    }

    // Whether a new file takes the place of what is there.
    bool Replaces(const Source& source, const Target& target) const {
        if (!Copies() || target.replaced || options_.remove_destination || options_.atomic) {
            return true;
        }
        if (!options_.manner.data) return false;
        const bool never_follows =
            options_.follow == Follow::kNever || (options_.follow == Follow::kUsual && !Follows());
        if (never_follows && !S_ISREG(source.info.st_mode)) return true;
        if (target.info->st_nlink < 2 || !S_ISREG(target.info->st_mode)) return false;
        // Whoever can give a file a second name could have another file overwritten.
        const struct stat directory = target.place.directory->Status();
        const bool trusted =
            directory.st_uid == 0 && (directory.st_mode & (S_IWGRP | S_IWOTH)) == 0;
        return options_.keeps_links || (::geteuid() == 0 && !trusted);
    }

    // What is no regular file is written to, and stays.
    void Feed(Source* source, const Target& target) {
        std::unique_ptr<const File> file;
        try {
            file = OpenSpecialTarget(target);
        } catch (const Refusal&) {
            if (!options_.force) throw;
        }
        if (!file) return Make(*source, target.named);
        if (!source->stream) OpenStream(source);
        transfer_.CopyStream(*source->stream, *file);
    }

    // POSIX makes what a dangling link leads to, where it is asked for.
    void WriteThrough(const Source& source, const Target& target) {
        const Place& to = target.named;
        if (std::getenv("POSIXLY_CORRECT") == nullptr) {
            throw Refusal("not writing through dangling symlink " + Quoted(to.path()),
                          "remove the link, or use --remove-destination");
        }
        const std::filesystem::path text =
            std::filesystem::read_symlink(to.directory->ProcPath(to.name));
        Place place =
            PlaceOf(std::filesystem::path(to.directory->ProcPath()) / text, Shown::kWhole);
        place.shown = to.path();
        Make(source, place);
    }

    void LinkOne(const Source& source, const Target& target) {
        const Place& to = target.place;
        const std::string what =
            "cannot create hard link " + Quoted(to.path()) + " to " + Quoted(source.named.path());
        if (target.info && !options_.force && options_.overwrite != Overwrite::kAsk &&
            !options_.remove_destination) {
            throw Refusal(what, EEXIST);
        }
        // Only directories are named like that.
        if (to.path().ends_with('/')) throw Refusal(what, ENOENT);
        transfer_.LinkObject(source.place, to);
    }

    void MakeLink(const Source& source, const Target& target) {
        const std::string& text = source.named.path();
        const Place& to = target.place;
        struct stat here;
        if (!text.starts_with('/') &&
            (::stat(".", &here) != 0 || !SameFile(here, to.directory->Status()))) {
            throw Refusal(
                Quoted(to.path()) + ": can make relative symbolic links only in current directory",
                "give the whole path");
        }
        if (to.path().ends_with('/')) {
            throw Refusal(
                "cannot create symbolic link " + Quoted(to.path()) + " to " + Quoted(text), ENOENT);
        }
        if (target.info && (options_.force || options_.remove_destination)) {
            RemoveObject(ObjectAt(to, &*target.own), true);
        }
        transfer_.MakeLink(text, to);
    }

    void Say(const Source& source, const Target& target, bool merges, const std::string& backup) {
        if (!options_.job.verbose || merges) return;
        const std::string to = Quoted(target.named.path());
        if (!Copies() && source.is_directory()) return job_.Say("created directory " + to);
        std::string line = Quoted(source.named.path()) + " -> " + to;
        if (!Copies()) line.insert(0, "copied ");
        if (!backup.empty()) line += " (backup: " + Quoted(backup) + ')';
        job_.Say(line);
    }

    // ---- Moving ---------------------------------------------------------------------------------

    // Has been copied, and goes when that is on disk.
    struct Carried {
        Place place;
        struct stat info;
        std::optional<UnfinishedMove> unfinished;
    };

    void MoveNamed(const Place& from, const struct stat& info, const std::string& path) {
        const Place to = TargetOf(path);
        // What has been carried out of a directory goes before the directory itself does.
        if (S_ISDIR(info.st_mode)) FinishMoves();
        job_.ShowProgress(path);
        const Source source = FindSource(from, false);
        if (IsNamedAgain(source, to)) return;
        RequireNamedFromAbove(path, from, to);
        Target target = FindTarget(to, false, options_.force);
        std::string backup;
        if (!MakeWay(source, &target, false, &backup)) return;
        const bool same = target.info && SameFile(*target.info, info);
        if (S_ISDIR(info.st_mode) && !same && IsInside(to, info)) {
            throw Refusal("cannot move " + Quoted(path) + " to a subdirectory of itself, " +
                              Quoted(to.path()),
                          kElsewhere);
        }
        if (Renames(from, to, target, same)) {
            job_.AddDone();
            std::string line = "renamed " + Quoted(path) + " -> " + Quoted(to.path());
            if (!backup.empty()) line += " (backup: " + Quoted(backup) + ')';
            return job_.Say(line);
        }
        if (same) throw AreTheSame(from, to);
        Carry(from, info, to, backup);
    }

    static void RequireNamedFromAbove(const std::string& path, const Place& from, const Place& to) {
        const std::string name = LastName(path);
        const auto move = "cannot move " + Quoted(path) + " to " + Quoted(to.path());
        if (name == "." || name == ".." || from.name == ".") throw Refusal(move, EBUSY);
        struct stat info;
        std::string bare = path;
        while (bare.size() > 1 && bare.back() == '/') bare.pop_back();
        if (bare.size() < path.size() && ::lstat(bare.c_str(), &info) == 0 &&
            S_ISLNK(info.st_mode)) {
            throw Refusal(move, ENOTDIR);
        }
    }

    bool Renames(const Place& from, const Place& to, const Target& target, bool same) {
        const std::string move = "cannot move " + Quoted(from.path()) + " to " + Quoted(to.path());
        if (!S_ISDIR(StatusOf(from).st_mode) && !target.info && to.path().ends_with('/')) {
            throw Refusal(move, ENOTDIR);
        }
        try {
            if (target.is_directory() && !same) {
                if (UnfinishedMove::Find(to, StatusOf(from))) return false;
                ClearDirectory(to);
            }
            return transfer_.Rename(from, to);
        } catch (const SystemFailure& failure) {
            throw Refusal(move, failure.error());
        }
    }

    void Carry(const Place& from, const struct stat& info, const Place& to,
               const std::string& backup) {
        const bool directory = S_ISDIR(info.st_mode);
        if (directory) RequireDescriptorPaths();
        const Object object = ObjectAt(from, &info);
        const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kFind);
        RequireOwnNames(object, sidecars);
        std::optional<UnfinishedMove> unfinished;
        if (directory || sidecars.Any()) {
            removal_began_ = UnfinishedMove::RemovalBegan(to);
            unfinished.emplace(to, info);
        }
        const std::uint64_t left = job_.failures() + job_.skipped();
        losses_ = 0;
        taken_ = backup;
        CopyTree(from, to);
        // All of it is there, or nothing goes here.
        const std::uint64_t now = job_.failures() + job_.skipped();
        const bool arrived = now == left || (options_.allow_loss && now == left + losses_);
        // Of a directory that was interrupted nobody has seen the rest.
        const bool whole = !job_.stopped() || !directory;
        if (whole && arrived) {
            carried_.push_back({from, info, unfinished});
        } else if (unfinished && !directory) {
            unfinished->Forget();
        }
        constexpr std::size_t kMost = 256;
        if (directory || carried_.size() >= kMost) FinishMoves();
    }

    void FinishMoves() {
        std::erase_if(carried_, [&](const Carried& carried) {
            return carried.unfinished &&
                   !Try(carried.place.path(), [&] { carried.unfinished->BeginRemoval(); });
        });
        if (carried_.empty() || !MakeDurable()) return carried_.clear();
        for (const Carried& carried : carried_) {
            const bool gone = RemoveCarried(
                carried.place, carried.info,
                MayGo{[&](const struct stat& info) { return transfer_.WasCopied(info); },
                      [&](const std::string& object, const struct stat& info) {
                          return transfer_.WasMetadata(object, info);
                      }},
                [&](const Place& place, mode_t type) {
                    if (options_.job.verbose) job_.Say(RemovalLine(place, type));
                },
                [&](const std::string& path, const Failure& failure) {
                    job_.AddFailure(path, failure);
                });
            if (!gone) continue;
            job_.AddDone();
            if (!carried.unfinished) continue;
            (void)Try(carried.place.path(), [&] { carried.unfinished->Forget(); });
        }
        carried_.clear();
    }

    bool MakeDurable() {
        return Try("the destination", [&] { transfer_.MakeDurable(); });
    }

    // False when it throws a Failure, which is told.
    template <class Work>
    bool Try(const std::string& path, Work work) {
        try {
            work();
            return true;
        } catch (const Failure& failure) {
            job_.AddFailure(path, failure);
            return false;
        }
    }

    // An empty directory may be replaced.
    static void ClearDirectory(const Place& to) {
        const auto* const moved = Foreseen::Find(*to.directory, to.name);
        const bool holds = moved != nullptr && moved->holds_entries;
        if (holds || !ObjectsIn(to.Open()).empty()) throw SystemFailure(to.path(), ENOTEMPTY);
        const struct stat info = StatusOf(to);
        RemoveEmptyDirectory(ObjectAt(to, &info), true);
    }

    Task task_;
    const CopyOptions& options_;
    JobOptions job_options_;
    Job job_;
    Transfer transfer_;
    Parents parents_;
    DirectoryRef directory_;            // that everything goes into
    std::optional<Place> destination_;  // or what it becomes
    // The object in hand has been asked for: the name of the backup that was made, if one was.
    std::optional<std::string> taken_;
    std::uint64_t losses_ = 0;
    std::vector<Carried> carried_;
    std::optional<timespec> removal_began_;    // of what is moved, by a run that was cut short
    std::set<std::pair<Entry, Entry>> named_;  // sources, and where they go
};

}  // namespace

ExitStatus Copy(const CopyOptions& options) { return Placement(Task::kCopy, options).Run(); }

ExitStatus Move(const CopyOptions& options) { return Placement(Task::kMove, options).Run(); }

}  // namespace mavoea::tool

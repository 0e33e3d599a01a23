#include "tools/move/copy.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/interrupt.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/removal.h"
#include "tools/transfer/transfer.h"
#include "tools/transfer/tree_copy.h"

namespace mavoea::tool {
namespace {

namespace fs = std::filesystem;

bool IsDirectory(const std::optional<struct stat>& info) { return info && S_ISDIR(info->st_mode); }

// What a path leads to, links followed.
std::optional<struct stat> StatusBehind(const std::string& path) {
    struct stat info;
    if (::stat(path.c_str(), &info) == 0) return info;
    if (errno == ENOENT) return std::nullopt;
    throw SystemFailure(path, errno);
}

std::string LastName(std::string path) {
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path.substr(path.rfind('/') + 1);
}

// Where a link at the end of a path leads. Failure when that is nowhere.
Place Resolved(const std::string& path) {
    std::error_code error;
    const fs::path resolved = fs::canonical(path, error);
    if (error) throw SystemFailure(path, error.value());
    return PlaceOf(resolved.string());
}

// Whether a link may be followed: the superuser follows no other user's, who could have put it
// there for a file that was named.
bool IsTrusted(const struct stat& link) { return ::geteuid() != 0 || link.st_uid == 0; }

bool SamePlace(const Place& one, const Place& other) {
    return one.name == other.name && SameFile(one.directory->Status(), other.directory->Status());
}

// Whether something is, or would be, `directory` or below it.
bool IsInside(const Place& place, const struct stat& directory) {
    if (const auto info = place.Status(); info && SameFile(*info, directory)) return true;
    int fd = ::fcntl(place.directory->fd(), F_DUPFD_CLOEXEC, 0);
    for (;;) {
        const File at(fd, place.path());
        if (fd < 0) throw SystemFailure(place.path(), errno);
        const struct stat info = at.Status();
        if (SameFile(info, directory)) return true;
        fd = ::openat(at.fd(), "..", O_PATH | O_DIRECTORY | O_CLOEXEC);
        struct stat above;
        if (fd >= 0 && ::fstat(fd, &above) == 0 && SameFile(above, info)) {
            ::close(fd);
            return false;
        }
    }
}

JobOptions WithSourcesOnly(const CopyOptions& options) {
    JobOptions job = options.job;
    if (!options.target_directory && job.paths.size() > 1) job.paths.pop_back();
    return job;
}

enum class Task { kCopy, kMove };

class Placement {
 public:
    Placement(Task task, const CopyOptions& options)
        : task_(task),
          options_(options),
          job_options_(WithSourcesOnly(options)),
          job_(task == Task::kCopy ? "copying" : "moving", task == Task::kCopy ? "copied" : "moved",
               job_options_),
          transfer_({.on_bytes = [this](std::uint64_t bytes) { job_.AddBytes(bytes); },
                     .give_up = InterruptedAgain,
                     .on_note = [this](const std::string& note) { job_.AddNote(note); },
                     .remembers = task == Task::kMove}) {
        hooks_.stopped = [this] { return job_.stopped(); };
        hooks_.may_take = [this](const Place& from, const struct stat& info, const Place& to) {
            return taken_ || MayTake(from, info, to);
        };
        hooks_.on_begin = [this](const Place& from) {
            taken_ = false;
            job_.ShowProgress(from.path());
        };
        hooks_.on_done = [this](const Place& from, const Place& to) {
            if (task_ == Task::kMove) return;
            job_.AddDone(from.path(), Quoted(from.path()) + " -> " + Quoted(to.path()));
        };
        hooks_.on_failure = [this](const std::string& path, const Failure& failure) {
            job_.AddFailure(path, failure);
            if (dynamic_cast<const Loss*>(&failure) != nullptr) ++losses_;
        };
        hooks_.on_skip = [this] { Skip(); };
        hooks_.recursive = job_options_.recursive || task == Task::kMove;
    }

    ExitStatus Run() {
        if (hooks_.recursive) RequireDescriptorPaths();
        FindDestination();
        for (const std::string& source : job_options_.paths) {
            if (job_.stopped()) break;
            try {
                PlaceNamed(source);
            } catch (const Failure& failure) {
                job_.AddFailure(source, failure);
            }
        }
        FinishMoves();
        if (task_ == Task::kCopy) MakeDurable();
        return job_.Finish();
    }

 private:
    // ---- Where to -------------------------------------------------------------------------------

    void FindDestination() {
        const auto into = [&](const std::string& path) {
            if (!IsDirectory(StatusBehind(path))) {
                throw Failure(kFailed, fs::absolute(path).lexically_normal().string(),
                              "it is not a directory", "name a directory that is there");
            }
            directory_ = DirectoryAt(path);
        };
        if (options_.target_directory) return into(*options_.target_directory);
        if (options_.job.paths.size() < 2) {
            throw Failure(kFailed, options_.job.paths.front(), "nothing says where it is to go",
                          "name the destination behind it");
        }
        const std::string& path = options_.job.paths.back();
        const bool respelled = task_ == Task::kMove && job_options_.paths.size() == 1 &&
                               IsRespelled(job_options_.paths.front(), path);
        if (!options_.no_target_directory && !respelled && IsDirectory(StatusBehind(path))) {
            return into(path);
        }
        if (job_options_.paths.size() > 1) {
            throw Failure(kFailed, path,
                          options_.no_target_directory
                              ? "with -T there is one source and one destination"
                              : "several objects cannot go there, it is not a directory",
                          "name a directory that is there");
        }
        if (path.ends_with('/') && !IsDirectory(PlaceOf(job_options_.paths.front()).Status())) {
            throw Failure(kFailed, path, "it is not a directory", "name a directory that is there");
        }
        destination_ = PlaceOf(path);
    }

    // Whether both are one directory on a file system that ignores case, and spelled otherwise.
    static bool IsRespelled(const std::string& source, const std::string& path) {
        const Place from = PlaceOf(source);
        const Place to = PlaceOf(path);
        const auto info = from.Status();
        const auto there = to.Status();
        return info && there && S_ISDIR(info->st_mode) && SameFile(*info, *there) &&
               !SamePlace(from, to);
    }

    static DirectoryRef DirectoryAt(const std::string& path) {
        return Directory::Open(path, fs::absolute(path + "/.").lexically_normal().parent_path());
    }

    Place TargetOf(const std::string& source) const {
        if (destination_) return *destination_;
        const std::string name = LastName(source);
        // The contents of such a directory are what is copied.
        if (name != "." && name != "..") return {directory_, name};
        return PlaceOf(directory_->path());
    }

    // ---- One object that was named --------------------------------------------------------------

    void PlaceNamed(const std::string& source) {
        Place from = FindObject(source).place;
        struct stat info = StatusOf(from);
        Place to = TargetOf(source);
        if (task_ == Task::kCopy && S_ISLNK(info.st_mode) && !job_options_.recursive) {
            if (!IsTrusted(info)) {
                throw Failure(
                    kFailed, from.path(),
                    "a symbolic link of another user, which the superuser does not follow",
                    "name what it leads to, or copy the link with -r");
            }
            from = Resolved(from.path());
            info = StatusOf(from);
        }
        if (task_ == Task::kMove) {
            const std::string name = LastName(source);
            if (name == "." || name == "..") {
                throw Failure(kFailed, source, "the directories \".\" and \"..\" are not moved",
                              "name it from the directory above it");
            }
        }
        if (S_ISDIR(info.st_mode) && task_ == Task::kCopy && !job_options_.recursive) {
            throw Failure(kFailed, source, "it is a directory", "use -r");
        }
        // A copy is written to where a link that was named leads.
        const auto target = to.Status();
        if (task_ == Task::kCopy && destination_ && target && S_ISLNK(target->st_mode) &&
            !S_ISLNK(info.st_mode) && IsTrusted(*target)) {
            to = Resolved(to.path());
        }
        const bool is_target = target && SameFile(*target, info);
        if (S_ISDIR(info.st_mode) && !is_target && IsInside(to, info)) {
            throw Failure(kFailed, from.path(),
                          std::string("a directory cannot be ") +
                              (task_ == Task::kCopy ? "copied" : "moved") + " into itself, " +
                              Quoted(to.path()),
                          "name another destination");
        }
        if (task_ == Task::kCopy) {
            CopyTree(&transfer_, from, to, hooks_);
        } else {
            MoveObject(from, info, to);
        }
    }

    // ---- What is in the way ---------------------------------------------------------------------

    // False when it is left as it is.
    bool MayTake(const Place& from, const struct stat& info, const Place& to) {
        const auto target = to.Status();
        if (!target) return true;
        RequireOther(from, info, to, *target);
        if (S_ISDIR(info.st_mode) && !S_ISDIR(target->st_mode)) {
            throw Failure(kFailed, from.path(),
                          "a directory cannot overwrite the non-directory " + Quoted(to.path()),
                          "move that away");
        }
        if (!S_ISDIR(info.st_mode) && S_ISDIR(target->st_mode)) {
            throw Failure(kFailed, from.path(),
                          "a non-directory cannot overwrite the directory " + Quoted(to.path()),
                          "move that away");
        }
        if (task_ == Task::kCopy && S_ISDIR(info.st_mode)) return true;  // they are merged
        if (SameFile(*target, info)) return true;                        // nothing is lost
        if (job_options_.consent == Consent::kNever) return false;
        const bool asks = task_ == Task::kMove || job_options_.consent == Consent::kAsk;
        if (asks) {
            return job_.MayBeLost(to.Writable(), "overwrite " + Quoted(to.path()) + '?') &&
                   !job_.stopped();
        }
        if (job_options_.consent != Consent::kForce && S_ISREG(target->st_mode) &&
            ::faccessat(to.directory->fd(), to.name.c_str(), W_OK, AT_EACCESS) != 0) {
            throw SystemFailure(to.path(), errno);
        }
        return true;
    }

    void RequireOther(const Place& from, const struct stat& info, const Place& to,
                      const struct stat& target) const {
        bool same = SameFile(info, target);
        // Two names of one file become one name, and one that differs in case only is another.
        if (same && task_ == Task::kMove) same = SamePlace(from, to);
        // A link would take the place of what it leads to.
        if (!same && task_ == Task::kCopy && S_ISLNK(info.st_mode)) {
            struct stat followed;
            same = ::fstatat(from.directory->fd(), from.name.c_str(), &followed, 0) == 0 &&
                   SameFile(followed, target);
        }
        if (!same) return;
        throw Failure(kFailed, from.path(), "it and " + Quoted(to.path()) + " are the same file",
                      "name another destination");
    }

    void Skip() {
        if (!job_.stopped()) job_.AddSkipped();
    }

    // ---- Moving ---------------------------------------------------------------------------------

    // Has been copied, and goes when that is on disk.
    struct Carried {
        Object object;
        std::string to;
    };

    void MoveObject(const Place& from, const struct stat& info, const Place& to) {
        // What has been carried out of a directory goes before the directory itself does.
        if (S_ISDIR(info.st_mode)) FinishMoves();
        if (!MayTake(from, info, to)) return Skip();
        job_.ShowProgress(from.path());
        const auto target = to.Status();
        const bool same = target && SameFile(*target, info);
        if (IsDirectory(target) && !same) ClearDirectory(to);
        if (transfer_.Rename(from, to)) return AddMoved(from.path(), to.path());
        if (same) {
            throw Failure(kFailed, from.path(),
                          "it and " + Quoted(to.path()) + " are the same file",
                          "name another destination");
        }
        const Object object = ObjectAt(from, &info);
        RequireOwnNames(object, Sidecars::Find(object, Sidecars::Services::kFind));
        const std::uint64_t left = job_.failures() + job_.skipped();
        losses_ = 0;
        taken_ = true;
        CopyTree(&transfer_, from, to, hooks_);
        // All of it is there, or nothing goes here.
        const std::uint64_t now = job_.failures() + job_.skipped();
        const bool arrived = now == left || (options_.allow_loss && now == left + losses_);
        // Of a directory that was interrupted nobody has seen the rest.
        const bool whole = !job_.stopped() || !S_ISDIR(info.st_mode);
        if (whole && arrived) carried_.push_back({object, to.path()});
        constexpr std::size_t kMost = 256;
        if (S_ISDIR(info.st_mode) || carried_.size() >= kMost) FinishMoves();
    }

    void FinishMoves() {
        if (carried_.empty() || !MakeDurable()) return carried_.clear();
        for (const Carried& carried : carried_) {
            const std::string path = carried.object.path();
            try {
                RemoveCarried(carried.object,
                              [&](const struct stat& info) { return transfer_.WasCopied(info); });
                AddMoved(path, carried.to);
            } catch (const Failure& failure) {
                job_.AddFailure(path, failure);
            }
        }
        carried_.clear();
    }

    bool MakeDurable() {
        try {
            transfer_.MakeDurable();
            return true;
        } catch (const Failure& failure) {
            job_.AddFailure(failure.subject(), failure);
            return false;
        }
    }

    void AddMoved(const std::string& from, const std::string& to) {
        job_.AddDone(from, "renamed " + Quoted(from) + " -> " + Quoted(to));
    }

    // An empty directory may be replaced.
    static void ClearDirectory(const Place& to) {
        if (!ObjectsIn(to.directory->OpenIn(to.name)).empty()) {
            throw SystemFailure(to.path(), ENOTEMPTY);
        }
        const struct stat info = StatusOf(to);
        RemoveEmptyDirectory(ObjectAt(to, &info), true, [](const struct stat&) { return true; });
    }

    Task task_;
    const CopyOptions& options_;
    JobOptions job_options_;
    Job job_;
    Transfer transfer_;
    TreeCopyHooks hooks_;
    DirectoryRef directory_;            // that everything goes into
    std::optional<Place> destination_;  // or what it becomes
    bool taken_ = false;                // the object in hand has been asked for
    std::uint64_t losses_ = 0;
    std::vector<Carried> carried_;
};

}  // namespace

ExitStatus Copy(const CopyOptions& options) { return Placement(Task::kCopy, options).Run(); }

ExitStatus Move(const CopyOptions& options) { return Placement(Task::kMove, options).Run(); }

}  // namespace mavoea::tool

#include "tools/copy.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <set>

#include "tools/carry.h"
#include "tools/delete.h"
#include "tools/directory.h"
#include "tools/interrupt.h"
#include "tools/text.h"
#include "tools/transfer.h"

namespace mavoea::tool {
namespace {

namespace fs = std::filesystem;

std::optional<struct stat> Status(const std::string& path, int flags = AT_SYMLINK_NOFOLLOW) {
    struct stat info;
    if (::fstatat(AT_FDCWD, path.c_str(), &info, flags) == 0) return info;
    if (errno == ENOENT) return std::nullopt;
    throw SystemFailure(path, errno);
}

bool SameFile(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

bool IsDirectory(const std::optional<struct stat>& info) { return info && S_ISDIR(info->st_mode); }

std::string Absolute(const std::string& path) {
    std::string absolute = fs::absolute(path).lexically_normal().string();
    while (absolute.size() > 1 && absolute.back() == '/') absolute.pop_back();
    return absolute;
}

std::string LastName(std::string path) {
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path.substr(path.rfind('/') + 1);
}

std::string Join(const std::string& directory, const std::string& name) {
    return directory == "/" ? '/' + name : directory + '/' + name;
}

// Where a link at the end of a path leads. Failure when that is nowhere.
std::string Resolved(const std::string& path) {
    std::error_code error;
    const fs::path resolved = fs::canonical(path, error);
    if (error) throw SystemFailure(path, error.value());
    return resolved.string();
}

// Whether `path`, which need not exist, is `directory` or lies below it.
bool IsInside(const std::string& path, const struct stat& directory) {
    std::error_code error;
    for (fs::path at = fs::weakly_canonical(path, error); !error; at = at.parent_path()) {
        const auto info = Status(at.string());
        if (info && SameFile(*info, directory)) return true;
        if (at == at.root_path()) break;
    }
    return false;
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
                     .on_note = [this](const std::string& note) { job_.AddNote(note); }}) {}

    ExitStatus Run() {
        FindDestination();
        for (const std::string& source : job_options_.paths) {
            if (job_.stopped()) break;
            try {
                PlaceNamed(source);
            } catch (const Failure& failure) {
                job_.AddFailure(source, failure);
            }
        }
        return job_.Finish();
    }

 private:
    // ---- Where to -------------------------------------------------------------------------------

    void FindDestination() {
        if (options_.target_directory) {
            destination_ = Absolute(*options_.target_directory);
            into_ = true;
        } else {
            if (options_.job.paths.size() < 2) {
                throw Failure(kFailed, options_.job.paths.front(), "nothing says where it is to go",
                              "name the destination behind it");
            }
            destination_ = Absolute(options_.job.paths.back());
            into_ = !options_.no_target_directory && IsDirectory(Status(destination_, 0));
            if (!into_ && job_options_.paths.size() > 1) {
                throw Failure(kFailed, options_.job.paths.back(),
                              options_.no_target_directory
                                  ? "with -T there is one source and one destination"
                                  : "several objects cannot go there, it is not a directory",
                              "name a directory that is there");
            }
        }
        if (into_ && !IsDirectory(Status(destination_, 0))) {
            throw Failure(kFailed, destination_, "it is not a directory",
                          "name a directory that is there");
        }
        if (!into_ && options_.job.paths.back().ends_with('/') &&
            !IsDirectory(Status(Absolute(job_options_.paths.front())))) {
            throw Failure(kFailed, options_.job.paths.back(), "it is not a directory",
                          "name a directory that is there");
        }
    }

    std::string TargetOf(const std::string& source) const {
        if (!into_) return destination_;
        const std::string name = LastName(source);
        // The contents of such a directory are what is copied.
        return name == "." || name == ".." ? destination_ : Join(destination_, name);
    }

    // ---- One object that was named --------------------------------------------------------------

    void PlaceNamed(const std::string& source) {
        std::string from = FindObject(source).path;
        struct stat info = *Status(from);
        std::string to = TargetOf(source);
        if (task_ == Task::kCopy && S_ISLNK(info.st_mode) && !job_options_.recursive) {
            from = Resolved(from);
            info = *Status(from);
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
        const auto target = Status(to);
        if (task_ == Task::kCopy && target && S_ISLNK(target->st_mode) && !S_ISLNK(info.st_mode)) {
            to = Resolved(to);
        }
        if (S_ISDIR(info.st_mode) && IsInside(to, info)) {
            throw Failure(kFailed, from,
                          std::string("a directory cannot be ") +
                              (task_ == Task::kCopy ? "copied" : "moved") + " into itself, " +
                              Quoted(to),
                          "name another destination");
        }
        if (!S_ISDIR(info.st_mode) && !made_.insert(to).second) {
            throw Failure(kFailed, from, "it would overwrite " + Quoted(to) + ", just made",
                          "give it another name");
        }
        if (task_ == Task::kCopy) {
            CopyTree(from, info, to);
        } else {
            MoveObject(from, info, to);
        }
    }

    // ---- What is in the way ---------------------------------------------------------------------

    // False when it is left as it is.
    bool MayTake(const std::string& from, const struct stat& info, const std::string& to) {
        const auto target = Status(to);
        if (!target) return true;
        RequireOther(from, info, to, *target);
        if (S_ISDIR(info.st_mode) && !S_ISDIR(target->st_mode)) {
            throw Failure(kFailed, from,
                          "a directory cannot overwrite the non-directory " + Quoted(to),
                          "move that away");
        }
        if (!S_ISDIR(info.st_mode) && S_ISDIR(target->st_mode)) {
            throw Failure(kFailed, from,
                          "a non-directory cannot overwrite the directory " + Quoted(to),
                          "move that away");
        }
        if (task_ == Task::kCopy && S_ISDIR(info.st_mode)) return true;  // they are merged
        if (job_options_.consent == Consent::kNever) return false;
        const bool asks = task_ == Task::kMove || job_options_.consent == Consent::kAsk;
        if (asks) return job_.MayBeLost(to, "overwrite " + Quoted(to) + '?') && !job_.stopped();
        if (job_options_.consent != Consent::kForce && S_ISREG(target->st_mode) &&
            ::faccessat(AT_FDCWD, to.c_str(), W_OK, AT_EACCESS) != 0) {
            throw SystemFailure(to, errno);
        }
        return true;
    }

    void RequireOther(const std::string& from, const struct stat& info, const std::string& to,
                      const struct stat& target) const {
        bool same = SameFile(info, target);
        if (same && task_ == Task::kMove) {
            // Two names of one file become one name.
            same = S_ISDIR(info.st_mode) ||
                   Resolved(fs::path(from).parent_path().string()) + '/' + LastName(from) ==
                       Resolved(fs::path(to).parent_path().string()) + '/' + LastName(to);
        }
        // A link would take the place of what it leads to.
        if (!same && task_ == Task::kCopy && S_ISLNK(info.st_mode)) {
            const auto followed = Status(from, 0);
            same = followed && SameFile(*followed, target);
        }
        if (!same) return;
        throw Failure(kFailed, from, "it and " + Quoted(to) + " are the same file",
                      "name another destination");
    }

    // ---- Copying --------------------------------------------------------------------------------

    // As deep as paths can be: each level takes a '/' and a letter of 4096 bytes.
    void CopyTree(const std::string& from, const struct stat& info, const std::string& to) {
        if (!MayTake(from, info, to)) return Skip();
        CopyAnyway(from, info, to);
    }

    void CopyAnyway(const std::string& from, const struct stat& info, const std::string& to) {
        job_.ShowProgress(from);
        if (!S_ISDIR(info.st_mode)) {
            // What is no file is read, as long as it is not copied with a tree.
            if (S_ISREG(info.st_mode) || S_ISLNK(info.st_mode) || job_options_.recursive ||
                task_ == Task::kMove) {
                transfer_.CopyObject(from, to);
            } else {
                transfer_.CopyContents(from, to);
            }
        } else {
            transfer_.MakeDirectory(from, to);
            CopyEntries(from, to);
            transfer_.FinishDirectory(from, to);
        }
        if (task_ == Task::kCopy) job_.AddDone(from, Quoted(from) + " -> " + Quoted(to));
    }

    void CopyEntries(const std::string& from, const std::string& to) {
        for (const Directory::Entry& entry : Directory::Open(from).Entries()) {
            if (job_.stopped()) return;
            const std::string source = Join(from, entry.name);
            try {
                const auto info = Status(source);
                if (!info || IsMetadataName(entry.name, *info)) continue;
                CopyTree(source, *info, Join(to, entry.name));
            } catch (const Failure& failure) {
                job_.AddFailure(source, failure);
            }
        }
    }

    void Skip() {
        if (!job_.stopped()) job_.AddSkipped();
    }

    // ---- Moving ---------------------------------------------------------------------------------

    void MoveObject(const std::string& from, const struct stat& info, const std::string& to) {
        if (!MayTake(from, info, to)) return Skip();
        job_.ShowProgress(from);
        if (IsDirectory(Status(to))) ClearDirectory(to);
        if (!transfer_.Rename(from, to)) {
            const std::uint64_t left = job_.failures() + job_.skipped();
            const auto target = Status(to);
            if (target && !S_ISDIR(info.st_mode) && SameFile(*target, info)) {
                throw Failure(kFailed, from, "it and " + Quoted(to) + " are the same file",
                              "name another destination");
            }
            CopyAnyway(from, info, to);
            // All of it is there, or nothing goes here.
            if (job_.stopped() || job_.failures() + job_.skipped() > left) return;
            DeleteMoved(from);
        }
        job_.AddDone(from, "renamed " + Quoted(from) + " -> " + Quoted(to));
    }

    // An empty directory may be replaced.
    void ClearDirectory(const std::string& to) {
        for (const Directory::Entry& entry : Directory::Open(to).Entries()) {
            struct stat info = {};
            info.st_mode = entry.type;
            if (!IsMetadataName(entry.name, info)) throw SystemFailure(to, ENOTEMPTY);
        }
        DeleteMoved(to);
    }

    Task task_;
    const CopyOptions& options_;
    JobOptions job_options_;
    Job job_;
    Transfer transfer_;
    std::string destination_;
    bool into_ = false;
    std::set<std::string> made_;
};

}  // namespace

ExitStatus Copy(const CopyOptions& options) { return Placement(Task::kCopy, options).Run(); }

ExitStatus Move(const CopyOptions& options) { return Placement(Task::kMove, options).Run(); }

}  // namespace mavoea::tool

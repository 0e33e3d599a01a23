#include "tools/move/delete.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "tools/move/ends.h"
#include "tools/place/dry_run.h"
#include "tools/place/paths.h"
#include "tools/place/volume.h"
#include "tools/say/job.h"
#include "tools/say/output.h"
#include "tools/transfer/removal.h"

namespace mavoea::tool {
namespace {

// With one slash at its end where there were more.
std::string WithOneSlash(std::string path) {
    while (path.size() > 2 && path.ends_with("//")) path.pop_back();
    return path;
}

// What a path leads to that somebody named.
struct Named {
    Place place;
    struct stat info;
    bool behind_link = false;  // it has a slash at its end, and would be a link without
};

// Throws SystemFailure.
Named FindNamed(const std::string& path) {
    if (path.empty()) throw SystemFailure(path, ENOENT);
    struct stat own;
    std::string bare = path;
    while (bare.size() > 1 && bare.back() == '/') bare.pop_back();
    const bool directory_only = bare.size() < path.size();
    const bool link = directory_only && ::lstat(bare.c_str(), &own) == 0 && S_ISLNK(own.st_mode);
    Named named;
    try {
        named.place = PlaceOf(path, Shown::kAsGiven);
    } catch (const SystemFailure& failure) {
        throw SystemFailure(path, link ? ENOTDIR : failure.error());
    }
    const Directory& directory = *named.place.directory;
    if (::fstatat(directory.fd(), named.place.name.c_str(), &named.info, AT_SYMLINK_NOFOLLOW) !=
        0) {
        throw SystemFailure(path, errno);
    }
    if (WouldBeGone(named.place)) throw SystemFailure(path, ENOENT);
    if (directory_only && !S_ISDIR(named.info.st_mode)) throw SystemFailure(path, ENOTDIR);
    named.place.shown = WithOneSlash(path);
    named.behind_link = link;
    return named;
}

class Deletion final : private TreeRemoval {
 public:
    explicit Deletion(const RemoveOptions& options)
        : options_(options), job_("removing", "removed", options.job) {
        const bool terminal = options.presumes_terminal || ::isatty(STDIN_FILENO) == 1;
        asks_always_ = options.ask == AskToRemove::kAlways;
        asks_if_protected_ = asks_always_ || (options.ask != AskToRemove::kNever && terminal);
    }

    ExitStatus Run() {
        if (options_.job.recursive) RequireDescriptorPaths();
        if (options_.ask == AskToRemove::kOnce && !AgreesToAll()) return job_.Finish();
        const NamedPaths named = {options_.job.paths, options_.job.list};
        PathReader paths(named, [this](const Failure& failure) { FailToRead(failure); });
        while (const auto path = job_.stopped() ? std::nullopt : paths.Next()) RemoveNamed(*path);
        Tidy();
        return job_.Finish();
    }

 private:
    // ---- What was named -------------------------------------------------------------------------

    bool AgreesToAll() {
        if (DryRun()) return true;
        constexpr std::size_t kMany = 3;
        const std::size_t count = options_.job.paths.size();
        const bool recursive = options_.job.recursive;
        const auto& list = options_.job.list;
        if (!list && (count == 0 || (!recursive && count <= kMany))) return true;
        const std::string what =
            list ? "all that is named in " + Quoted(*list)
                 : std::to_string(count) + (count == 1 ? " argument" : " arguments");
        return job_.Ask("remove " + what + (recursive ? " recursively?" : "?"));
    }

    void FailToRead(const Failure& failure) { job_.AddFailure(failure.subject(), failure); }

    void RemoveNamed(const std::string& path) {
        try {
            Named named = FindNamed(path);
            behind_link_ = named.behind_link;
            if (S_ISDIR(named.info.st_mode)) RequireRemovable(path, named);
            // What has been listed there stays known.
            DirectoryRef& directory = named.place.directory;
            if (IsLikeLast(*directory)) directory = last_;
            last_ = directory;
            RemoveTree(named.place, named.info);
        } catch (const SystemFailure& failure) {
            const int error = failure.error();
            if (options_.force && (error == ENOENT || error == ENOTDIR)) return;
            Fail(path, Refusal("cannot remove " + Quoted(path), error));
        } catch (const Failure& failure) {
            Fail(path, failure);
        }
    }

    void RequireRemovable(const std::string& path, const Named& named) {
        const bool recursive = options_.job.recursive;
        if (!recursive && !options_.directories) throw SystemFailure(path, EISDIR);
        const std::string last = LastName(path);
        if (last == "." || last == "..") {
            throw Refusal(
                "refusing to remove '.' or '..' directory: skipping " + Quoted(named.place.path()),
                "name it from the directory above it");
        }
        struct stat root;
        if (recursive && options_.preserve_root && ::stat("/", &root) == 0 &&
            SameFile(root, named.info)) {
            const std::string name = named.place.path();
            throw TwoLines("it is dangerous to operate recursively on " + Quoted(name) +
                               (name == "/" ? "" : " (same as '/')"),
                           "use --no-preserve-root to override this failsafe");
        }
        if (recursive && options_.preserve_mounts &&
            named.place.directory->Status().st_dev != named.info.st_dev) {
            throw TwoLines(OnAnotherDevice(named.place), "and --preserve-root=all is in effect");
        }
    }

    static std::string OnAnotherDevice(const Place& place) {
        return "skipping " + Quoted(place.path()) + ", since it's on a different device";
    }

    bool IsLikeLast(const Directory& directory) const {
        return last_ && last_->path() == directory.path() &&
               last_->location() == directory.location() &&
               SameFile(last_->Status(), directory.Status());
    }

    // ---- Each object ----------------------------------------------------------------------------

    bool Stopped() const override { return job_.stopped(); }
    bool MayBeGone() const override { return options_.force || !at_top(); }

    void Fail(const std::string& path, const Failure& failure) override {
        job_.AddFailure(path, failure);
        if (dynamic_cast<const TwoLines*>(&failure) != nullptr && SpeaksAsAnother()) {
            Report(static_cast<const TwoLines&>(failure).second());
        }
    }

    void Removed(const Place& place, mode_t type) override {
        job_.AddDone();
        if (job_.wants_progress()) job_.ShowProgress(place.path());
        if (!options_.job.verbose) return;
        job_.Say(RemovalLine(place, type));
    }

    Answer MayEnter(const Place& place, const struct stat& info, bool empty) override {
        if (at_top()) device_ = info.st_dev;
        if (options_.one_file_system && info.st_dev != device_) {
            throw Refusal(OnAnotherDevice(place), "leave out --one-file-system");
        }
        if (empty) return MayRemove(place, S_IFDIR);
        if (!options_.job.recursive) throw SystemFailure(place.path(), ENOTEMPTY);
        return Ask("descend into ", place, S_IFDIR);
    }

    Answer MayRemove(const Place& place, mode_t type) override {
        if (Ask("remove ", place, type) == Answer::kNo) return Answer::kNo;
        if (!at_top() || !behind_link_) return Answer::kYes;
        if (options_.force) return Answer::kNo;
        throw SystemFailure(place.path(), ENOTDIR);
    }

    Answer Ask(const char* what, const Place& place, mode_t type) {
        const bool is_protected = asks_if_protected_ && !place.Writable();
        if ((!asks_always_ && !is_protected) || DryRun()) return Answer::kYes;
        const std::string name = S_ISDIR(type) ? "directory" : NameOfType(StatusOf(place));
        const std::string object =
            (is_protected ? "write-protected " : "") + name + ' ' + Quoted(place.path());
        if (job_.Ask(what + object + '?')) return Answer::kYes;
        if (!job_.stopped()) job_.AddSkipped();
        return Answer::kNo;
    }

    // A refusal that rm says in two lines.
    class TwoLines : public Refusal {
     public:
        TwoLines(const std::string& first, const std::string& second)
            : Refusal(first, second), second_(second) {}
        const std::string& second() const { return second_; }

     private:
        std::string second_;
    };

    const RemoveOptions& options_;
    Job job_;
    bool asks_always_;
    bool asks_if_protected_;
    DirectoryRef last_;         // in which something was named
    bool behind_link_ = false;  // what is in hand
    dev_t device_ = 0;          // of what was named
};

}  // namespace

ExitStatus Delete(const RemoveOptions& options) { return Deletion(options).Run(); }

}  // namespace mavoea::tool

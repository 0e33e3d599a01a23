#include "tools/move/delete.h"

#include <sys/stat.h>

#include <vector>

#include "tools/place/volume.h"
#include "tools/say/text.h"
#include "tools/transfer/removal.h"
#include "tools/transfer/tree_copy.h"

namespace mavoea::tool {
namespace {

bool Always(const struct stat&) { return true; }

std::string LastName(std::string path) {
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path.substr(path.rfind('/') + 1);
}

class Deletion {
 public:
    explicit Deletion(const JobOptions& options)
        : options_(options), job_("removing", "removed", options) {}

    ExitStatus Run() {
        if (options_.recursive) RequireDescriptorPaths();
        for (const std::string& path : options_.paths) {
            if (job_.stopped()) break;
            Guard(path, [&] { DeleteNamed(path); });
            while (!levels_.empty()) GoOn();
        }
        return job_.Finish();
    }

 private:
    // A directory that is being emptied.
    struct Level {
        Object object;
        DirectoryRef inside;
        std::vector<Directory::Entry> entries;
        std::uint64_t left;  // failed or skipped before
        std::size_t next = 0;
    };

    template <class Work>
    void Guard(const std::string& path, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            // Nothing is wrong with what has gone meanwhile, or with -f was never there.
            const bool gone = failure.status() == kNotFound && failure.subject() == path;
            if (gone && (options_.consent == Consent::kForce || !levels_.empty())) return;
            job_.AddFailure(path, failure);
        }
    }

    void DeleteNamed(const std::string& path) {
        const std::string last = LastName(path);
        if (last == "." || last == "..") {
            throw Failure(kFailed, path, "the directories \".\" and \"..\" are not removed",
                          "name it from the directory above it");
        }
        const Object object = FindObject(path);
        if (object.is_root()) {
            throw Failure(kFailed, path, "the root is not removed", "name something below it");
        }
        const auto info = object.place.Status();
        if (info && S_ISDIR(info->st_mode) && !options_.recursive) {
            throw Failure(kFailed, path, "it is a directory", "use -r");
        }
        Begin(object);
    }

    void Begin(const Object& object) {
        const std::string path = object.path();
        const auto info = object.place.Status();
        if (!info) throw SystemFailure(path, ENOENT);
        if (!S_ISDIR(info->st_mode)) {
            const std::string what = std::string("remove ") + NameOfType(info->st_mode) + ' ';
            if (!job_.MayBeLost(object.place.Writable(), what + Quoted(path) + '?')) return Skip();
            if (job_.stopped()) return;
            RemoveObject(object, levels_.empty(), Always);
            job_.AddDone(path, "removed " + Quoted(path));
            return;
        }
        const DirectoryRef inside = object.place.directory->OpenIn(object.place.name);
        if (options_.consent == Consent::kAsk && !inside->Entries().empty() &&
            !job_.Ask("descend into directory " + Quoted(path) + '?')) {
            return Skip();
        }
        levels_.push_back({object, inside, ObjectsIn(inside), job_.failures() + job_.skipped()});
    }

    // The next of what is in the innermost directory, or that directory itself.
    void GoOn() {
        Level& level = levels_.back();
        if (job_.stopped()) return levels_.clear();
        if (level.next < level.entries.size()) {
            const Place place = {level.inside, level.entries[level.next++].name};
            const std::string path = place.path();
            return Guard(path, [&] {
                const auto info = place.Status();
                if (info) Begin(ObjectAt(place, &*info));
            });
        }
        const Level done = std::move(level);
        levels_.pop_back();
        if (job_.failures() + job_.skipped() > done.left) return;
        const std::string path = done.object.path();
        if (options_.consent == Consent::kAsk &&
            !job_.Ask("remove directory " + Quoted(path) + '?')) {
            return Skip();
        }
        if (job_.stopped()) return levels_.clear();
        Guard(path, [&] {
            RemoveEmptyDirectory(done.object, levels_.empty(), Always);
            job_.AddDone(path, "removed directory " + Quoted(path));
        });
    }

    void Skip() {
        if (!job_.stopped()) job_.AddSkipped();
    }

    const JobOptions& options_;
    Job job_;
    std::vector<Level> levels_;
};

}  // namespace

ExitStatus Delete(const JobOptions& options) { return Deletion(options).Run(); }

}  // namespace mavoea::tool

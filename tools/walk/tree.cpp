#include "tools/walk/tree.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstddef>

#include "include/mavoea.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

bool IsDirectory(const Place& place) {
    const auto info = place.Status();
    return info && S_ISDIR(info->st_mode);
}

// One tree.
class Walk {
 public:
    explicit Walk(const Visit& visit) : visit_(visit) {}

    void Run(const std::string& path, bool recursive) {
        Object object;
        try {
            object = FindObject(path);
            visit_.on_named(object);
        } catch (const Failure& failure) {
            return visit_.on_failure(path, failure);
        }
        const bool descends = recursive && IsDirectory(object.place);
        // The root has no directory to keep metadata in.
        const bool skipped = descends && object.is_root();
        if ((skipped || visit_.work(object, path)) && descends) pending_.push_back(object.place);
        while (!pending_.empty()) {
            const Place place = pending_.back();
            pending_.pop_back();
            Guard(place, [&] { DoDirectory(place); });
        }
    }

 private:
    template <class Work>
    void Guard(const Place& place, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            if (!HasGone(place, failure)) visit_.on_failure(place.path(), failure);
        }
    }

    // What is pending keeps the directory open in which it is, and none besides: no depth takes
    // more than the heap.
    void DoDirectory(const Place& place) {
        const DirectoryRef directory = place.directory->OpenIn(place.name);
        visit_.on_directory(directory);
        const std::size_t first = pending_.size();
        for (const Directory::Entry& entry : ObjectsIn(directory)) {
            if (S_ISLNK(entry.type) || MAVOEAIsHiddenDirName(entry.name.c_str()) != 0) continue;
            const Place inner = {directory, entry.name};
            Guard(inner, [&] {
                const bool descends = visit_.work(ObjectAt(inner, entry.type), inner.path());
                if (descends && S_ISDIR(entry.type)) pending_.push_back(inner);
            });
        }
        std::reverse(pending_.begin() + static_cast<std::ptrdiff_t>(first), pending_.end());
    }

    const Visit& visit_;
    std::vector<Place> pending_;  // directories
};

// ---- The work -----------------------------------------------------------------------------------

class Work {
 public:
    explicit Work(const Task& task)
        : task_(task), report_({task.doing, task.done, task.current, task.nothing}) {}

    void Run(const TreeOptions& options) {
        VisitObjects(
            options.paths, options.recursive,
            {.work = [this](const Object& object, const std::string&) { return DoObject(object); },
             .on_failure = [this](const std::string& path,
                                  const Failure& failure) { report_.AddFailure(path, failure); },
             .on_named = task_.on_named,
             .on_directory = task_.on_directory});
    }

    ExitStatus Finish(bool json) { return report_.Finish(json); }

 private:
    // False when what is below it would fail for the same reason.
    bool DoObject(const Object& object) {
        report_.Show(object.path());
        bool suits = false;
        try {
            task_.check(object);
            suits = true;
            report_.Add(task_.work(object, report_.notes()));
        } catch (const Failure& failure) {
            if (!suits || !HasGone(object.place, failure)) {
                report_.AddFailure(object.path(), failure);
            }
        }
        return suits;
    }

    const Task& task_;
    TreeReport report_;
};

}  // namespace

bool HasGone(const Place& place, const Failure& failure) {
    return failure.status() == kNotFound && !place.directory->Has(place.name);
}

void VisitObjects(const std::vector<std::string>& paths, bool recursive, const Visit& visit) {
    if (recursive) RequireDescriptorPaths();
    for (const std::string& path : paths) Walk(visit).Run(path, recursive);
}

ExitStatus RunOnTree(const TreeOptions& options, const Task& task) {
    Work work(task);
    work.Run(options);
    return work.Finish(options.json);
}

}  // namespace mavoea::tool

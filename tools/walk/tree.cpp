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

// One tree after the other.
class Walk {
 public:
    Walk(const TreeOptions& options, const Visit& visit)
        : recursive_(options.recursive), shard_(options.shard), visit_(visit) {}

    void Run(const std::string& path) {
        const PathHash hash = PathHash::OfNamed(path);
        if (!recursive_ && !shard_.Has(hash)) return;
        try {
            const Object object = FindObject(path);
            const bool descends = recursive_ && IsDirectory(object.place);
            if (!descends && !shard_.Has(hash)) return;
            visit_.on_named(object);
            // The root has no directory to keep metadata in.
            const bool enters = (descends && object.is_root()) || Do(object, hash, path);
            if (enters && descends) pending_.push_back({object.place, hash});
        } catch (const Failure& failure) {
            Fail(path, hash, failure);
        }
        while (!pending_.empty()) {
            const Inner directory = std::move(pending_.back());
            pending_.pop_back();
            Guard(directory, [&] { DoDirectory(directory); });
        }
    }

    // What has kept this shard from objects that may be its own.
    void Finish() const {
        if (others_ == 0) return;
        visit_.on_failure({},
                          {gravest_, "shard " + ShardText(shard_),
                           std::to_string(others_) + (others_ == 1 ? " path" : " paths") +
                               " of other shards could not be looked into",
                           "see what these say of " + std::string(others_ == 1 ? "it" : "them")});
    }

 private:
    struct Inner {
        Place place;
        PathHash hash;
    };

    // Whether what is in it, if it is a directory, is to be looked at.
    bool Do(const Object& object, PathHash hash, const std::string& shown) {
        if (shard_.Has(hash)) return visit_.work(object, shown);
        visit_.on_other(object);
        return true;
    }

    void Fail(const std::string& path, PathHash hash, const Failure& failure) {
        if (shard_.Has(hash)) return visit_.on_failure(path, failure);
        ++others_;
        gravest_ = std::max(gravest_, failure.status());
    }

    template <class Work>
    void Guard(const Inner& inner, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            if (!HasGone(inner.place, failure)) Fail(inner.place.path(), inner.hash, failure);
        }
    }

    // What is pending keeps the directory open in which it is, and none besides: no depth takes
    // more than the heap.
    void DoDirectory(const Inner& outer) {
        const DirectoryRef directory = outer.place.directory->OpenIn(outer.place.name);
        visit_.on_directory(directory);
        const std::size_t first = pending_.size();
        for (const Directory::Entry& entry : ObjectsIn(directory)) {
            if (S_ISLNK(entry.type) || MAVOEAIsHiddenDirName(entry.name.c_str()) != 0) continue;
            const Inner inner = {{directory, entry.name}, outer.hash.Below(entry.name)};
            if (!S_ISDIR(entry.type) && !shard_.Has(inner.hash)) continue;
            Guard(inner, [&] {
                const Object object = ObjectAt(inner.place, entry.type);
                const bool enters = Do(object, inner.hash, inner.place.path());
                if (enters && S_ISDIR(entry.type)) pending_.push_back(inner);
            });
        }
        std::reverse(pending_.begin() + static_cast<std::ptrdiff_t>(first), pending_.end());
    }

    bool recursive_;
    Shard shard_;
    const Visit& visit_;
    std::vector<Inner> pending_;     // directories
    std::uint64_t others_ = 0;       // failures, with what belongs to other shards
    ExitStatus gravest_ = kSuccess;  // of those
};

// ---- The work -----------------------------------------------------------------------------------

class Work {
 public:
    explicit Work(const Task& task)
        : task_(task), report_({task.doing, task.done, task.current, task.nothing}) {}

    void Run(const TreeOptions& options) {
        VisitObjects(
            options,
            {.work = [this](const Object& object, const std::string&) { return DoObject(object); },
             .on_failure = [this](const std::string& path,
                                  const Failure& failure) { report_.AddFailure(path, failure); },
             .on_named = task_.on_named,
             .on_directory = task_.on_directory,
             .on_other = task_.check});
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

void VisitObjects(const TreeOptions& options, const Visit& visit) {
    if (options.recursive) RequireDescriptorPaths();
    Walk walk(options, visit);
    PathReader paths(options.paths,
                     [&](const Failure& failure) { visit.on_failure(failure.subject(), failure); });
    while (const auto path = paths.Next()) walk.Run(*path);
    walk.Finish();
}

ExitStatus RunOnTree(const TreeOptions& options, const Task& task) {
    Work work(task);
    work.Run(options);
    return work.Finish(options.json);
}

}  // namespace mavoea::tool

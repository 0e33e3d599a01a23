#include "tools/walk/tree.h"

#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <iostream>

#include "include/mavoea.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
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
    explicit Work(const Task& task) : task_(task), progress_(task.doing) {}

    void Run(const TreeOptions& options) {
        VisitObjects(
            options.paths, options.recursive,
            {.work = [this](const Object& object, const std::string&) { return DoObject(object); },
             .on_failure = [this](const std::string& path,
                                  const Failure& failure) { Add(path, failure); },
             .on_named = task_.on_named,
             .on_directory = task_.on_directory});
    }

    ExitStatus Summarize(bool json) {
        progress_.Clear();
        if (json) {
            PrintJson();
        } else {
            PrintText();
        }
        return status_;
    }

 private:
    // False when what is below it would fail for the same reason.
    bool DoObject(const Object& object) {
        progress_.Show(StatusText(), object.path());
        bool suits = false;
        try {
            task_.check(object);
            suits = true;
            ++counts_[static_cast<std::size_t>(task_.work(object, &notes_))];
        } catch (const Failure& failure) {
            if (!suits || !HasGone(object.place, failure)) Add(object.path(), failure);
        }
        return suits;
    }

    void Add(const std::string& path, const Failure& failure) {
        failures_.push_back({path, failure.what()});
        status_ = std::max(status_, failure.status());
    }

    std::uint64_t Total() const { return counts_[0] + counts_[1] + counts_[2]; }

    std::string StatusText() const {
        const std::string done = std::to_string(Total()) + " done";
        return failures_.empty() ? done
                                 : done + ", " + std::to_string(failures_.size()) + " failed";
    }

    // The words of the outcomes that can be, in the order of Outcome.
    std::array<const char*, 3> Words() const { return {task_.done, task_.current, task_.nothing}; }

    void PrintText() const {
        for (std::size_t i = 0; i < counts_.size(); ++i) {
            if (Words()[i] != nullptr) std::cout << counts_[i] << ' ' << Words()[i] << ", ";
        }
        std::cout << failures_.size() << " failed\n";
        for (const std::string& note : notes_) Note(note);
        for (const FailedObject& failed : failures_) Report(failed.message);
    }

    void PrintJson() const {
        constexpr std::array<const char*, 3> kKeys = {"done", "current", "nothing"};
        Json json;
        json.Set("task", task_.doing);
        for (std::size_t i = 0; i < counts_.size(); ++i) {
            if (Words()[i] != nullptr) json.Set(kKeys[i], counts_[i]);
        }
        json.Set("failed", failures_.size());
        SetMessages(json, "notes", notes_);
        SetFailures(json, failures_);
        Print(json);
        for (const FailedObject& failed : failures_) Report(failed.message);
    }

    const Task& task_;
    Progress progress_;
    std::array<std::uint64_t, 3> counts_{};  // by Outcome
    Notes notes_;
    std::vector<FailedObject> failures_;
    ExitStatus status_ = kSuccess;
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
    return work.Summarize(options.json);
}

}  // namespace mavoea::tool

#include "tools/tree.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <iostream>
#include <memory>

#include "include/mavoea.h"
#include "tools/file.h"
#include "tools/output.h"
#include "tools/progress.h"
#include "tools/text.h"

namespace mavoea::tool {
namespace {

// ---- Directories --------------------------------------------------------------------------------

// A symbolic link is none, wherever it points.
bool IsDirectory(const std::string& path) {
    struct stat info;
    return ::lstat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

// Whether what lies in a directory under that name is an object.
bool IsObject(const std::string& name, const struct stat& info) {
    if (S_ISLNK(info.st_mode)) return false;
    if (MAVOEAIsHiddenDirName(name.c_str()) != 0 || MAVOEAIsHiddenName(name.c_str()) != 0) {
        return false;
    }
    return S_ISDIR(info.st_mode) || !name.starts_with("._");
}

// All names in it, sorted, before anything in it changes.
std::vector<std::string> NamesIn(const std::string& directory) {
    const std::unique_ptr<DIR, int (*)(DIR*)> dir(::opendir(directory.c_str()), ::closedir);
    if (!dir) throw SystemFailure(directory, errno);
    std::vector<std::string> names;
    for (;;) {
        errno = 0;
        const dirent* const entry = ::readdir(dir.get());
        if (entry == nullptr) break;
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") names.emplace_back(name);
    }
    if (errno != 0) throw SystemFailure(directory, errno);
    std::sort(names.begin(), names.end());
    return names;
}

// ---- The work -----------------------------------------------------------------------------------

class Walk {
 public:
    explicit Walk(const Task& task) : task_(task), progress_(task.doing) {}

    void Do(const std::string& path, bool recursive) {
        Object object;
        try {
            object = FindObject(path);
        } catch (const Failure& failure) {
            Add(path, failure);
            return;
        }
        if (!recursive || !IsDirectory(object.path)) {
            (void)DoObject(object);
            return;
        }
        // The root has no directory to keep metadata in.
        if (object.path == "/" || DoObject(object)) DoTree(object.path);
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
    // Everything below a directory, which is done already. No depth takes more than the heap.
    void DoTree(const std::string& top) {
        std::vector<std::string> pending = {top};
        while (!pending.empty()) {
            const std::string directory = std::move(pending.back());
            pending.pop_back();
            try {
                const std::size_t first = pending.size();
                DoDirectory(directory, &pending);
                std::reverse(pending.begin() + static_cast<std::ptrdiff_t>(first), pending.end());
            } catch (const Failure& failure) {
                AddIfThere(directory, failure);
            }
        }
    }

    void DoDirectory(const std::string& directory, std::vector<std::string>* pending) {
        const std::string prefix = directory == "/" ? directory : directory + '/';
        for (const std::string& name : NamesIn(directory)) {
            const std::string path = prefix + name;
            try {
                struct stat info;
                if (::lstat(path.c_str(), &info) != 0) throw SystemFailure(path, errno);
                if (!IsObject(name, info)) continue;
                if (DoObject(FindObject(path)) && S_ISDIR(info.st_mode)) pending->push_back(path);
            } catch (const Failure& failure) {
                AddIfThere(path, failure);
            }
        }
    }

    // False when what is below it would fail for the same reason.
    bool DoObject(const Object& object) {
        progress_.Show(StatusText(), object.path);
        bool suits = false;
        try {
            task_.check(object);
            suits = true;
            ++counts_[static_cast<std::size_t>(task_.work(object, &notes_))];
        } catch (const Failure& failure) {
            Add(object.path, failure);
        }
        return suits;
    }

    // Nothing is wrong with what has gone since its directory was read.
    void AddIfThere(const std::string& path, const Failure& failure) {
        if (failure.status() != kNotFound || Exists(path)) Add(path, failure);
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

ExitStatus RunOnTree(const TreeOptions& options, const Task& task) {
    Walk walk(task);
    for (const std::string& path : options.paths) walk.Do(path, options.recursive);
    return walk.Summarize(options.json);
}

}  // namespace mavoea::tool

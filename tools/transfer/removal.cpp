#include "tools/transfer/removal.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <optional>
#include <vector>

#include "tools/say/messages.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/indexes.h"
#include "tools/transfer/tree_copy.h"

namespace mavoea::tool {
namespace {

Failure HasNotGone(const std::string& path) {
    return {kFailed, path, "it has changed, or come, since its directory was carried",
            "give the command again"};
}

// What lies beside an object that is about to go.
class Beside {
 public:
    Beside(const Object& object, bool alone)
        : object_(object), sidecars_(Sidecars::Find(object, Sidecars::Services::kFind)) {
        if (!sidecars_.AnyByName()) return;
        if (alone) {
            RequireOwnNames(object);
        } else if (SharesNames(object.place)) {
            shared_ = true;  // it goes with the last of them
        }
    }

    void Remove(const MayGo& may_go) const {
        if (shared_) return;
        std::vector<Sidecars::Found> files;
        std::optional<Failure> failure;
        for (const Sidecars::Found& file : sidecars_.Files()) {
            if (S_ISDIR(file.info.st_mode) || may_go(file.info)) {
                files.push_back(file);
            } else {
                failure = HasNotGone(file.path());
            }
        }
        RemoveFiles(files);
        RemoveEmptyDirectories(object_, sidecars_);
        if (failure) throw Failure(*failure);
    }

 private:
    const Object& object_;
    Sidecars sidecars_;
    bool shared_ = false;
};

// An EA directory in which nothing belongs to an object any more.
void RemoveEaDirectory(const Directory& inside, const MayGo& may_go) {
    const auto info = inside.StatusOf(kEaDirName);
    if (!info || !S_ISDIR(info->st_mode)) return;
    const DirectoryRef ea_dir = inside.OpenIn(kEaDirName);
    const auto remove = [&](const auto& self, const Directory& in) -> void {
        for (const Directory::Entry& entry : in.Entries()) {
            const auto now = in.StatusOf(entry.name);
            if (!now) continue;
            if (S_ISDIR(now->st_mode)) {
                self(self, *in.OpenIn(entry.name));
                (void)in.RemoveEmpty(entry.name);
            } else if (entry.name == kCoverName || may_go(*now)) {
                (void)in.RemoveFile(entry.name);
            } else {
                throw HasNotGone(in.PathOf(entry.name));
            }
        }
    };
    remove(remove, *ea_dir);
    (void)inside.RemoveEmpty(kEaDirName);
}

}  // namespace

void RemoveObject(const Object& object, bool alone, const MayGo& may_go) {
    const Beside beside(object, alone);
    if (!may_go(StatusOf(object.place))) throw HasNotGone(object.path());
    // Data first: without it, metadata is of no use to anybody.
    if (!object.place.directory->RemoveFile(object.place.name)) {
        throw SystemFailure(object.path(), ENOENT);
    }
    beside.Remove(may_go);
    ReportRemoved(object.path());
}

void RemoveEmptyDirectory(const Object& object, bool alone, const MayGo& may_go) {
    const Beside beside(object, alone);
    {
        const DirectoryRef inside = object.place.directory->OpenIn(object.place.name);
        for (const Directory::Entry& entry : inside->Entries()) {
            if (entry.name != kEaDirName || !S_ISDIR(entry.type)) {
                throw SystemFailure(object.path(), ENOTEMPTY);
            }
        }
        RemoveEaDirectory(*inside, may_go);
    }
    if (::unlinkat(object.place.directory->fd(), object.place.name.c_str(), AT_REMOVEDIR) != 0) {
        throw SystemFailure(object.path(), errno);
    }
    beside.Remove(may_go);
    ReportRemoved(object.path());
}

void RemoveCarried(const Object& object, const MayGo& was_carried) {
    struct Level {
        Object object;
        DirectoryRef inside;
        std::vector<Directory::Entry> entries;
        std::size_t next = 0;
    };
    std::optional<Failure> failure;
    std::vector<Level> levels;
    const auto begin = [&](const Object& one) {
        if (!S_ISDIR(StatusOf(one.place).st_mode)) {
            return RemoveObject(one, levels.empty(), was_carried);
        }
        const DirectoryRef inside = one.place.directory->OpenIn(one.place.name);
        levels.push_back({one, inside, ObjectsIn(inside)});
    };
    const auto guard = [&](auto work) {
        try {
            work();
        } catch (const Failure& problem) {
            if (!failure) failure = problem;
        }
    };
    guard([&] { begin(object); });
    while (!levels.empty()) {
        Level& level = levels.back();
        if (level.next < level.entries.size()) {
            const Place place = {level.inside, level.entries[level.next++].name};
            guard([&] {
                const auto info = place.Status();
                if (info) begin(ObjectAt(place, &*info));
            });
        } else {
            const Object done = level.object;
            levels.pop_back();
            if (!failure) {
                guard([&] { RemoveEmptyDirectory(done, levels.empty(), was_carried); });
            }
        }
    }
    if (failure) throw Failure(*failure);
}

}  // namespace mavoea::tool

#include "tools/transfer/tree_copy.h"

#include <algorithm>
#include <vector>

#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

class TreeCopy {
 public:
    TreeCopy(Transfer* transfer, const TreeCopyHooks& hooks)
        : transfer_(*transfer), hooks_(hooks) {}

    void Run(const Place& from, const Place& to) {
        Begin(from, to);
        while (!levels_.empty()) {
            Level& level = levels_.back();
            if (level.next < level.entries.size() && !hooks_.stopped()) {
                const std::string& name = level.entries[level.next++].name;
                Begin({level.inside, name}, {level.made, name});
            } else {
                // What was begun is given its attributes all the same.
                const Level done = std::move(level);
                levels_.pop_back();
                Guard(done.from, [&] {
                    transfer_.FinishDirectory(done.from, *done.inside, done.to, done.made);
                    hooks_.on_done(done.from, done.to);
                });
            }
        }
    }

 private:
    // A directory that has been made, and what is in it.
    struct Level {
        Place from;
        Place to;
        DirectoryRef inside;
        DirectoryRef made;
        std::vector<Directory::Entry> entries;
        std::size_t next = 0;
    };

    template <class Work>
    void Guard(const Place& from, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            hooks_.on_failure(from.path(), failure);
        }
    }

    void Begin(const Place& from, const Place& to) {
        Guard(from, [&] {
            const struct stat info = StatusOf(from);
            if (!hooks_.may_take(from, info, to)) return hooks_.on_skip();
            hooks_.on_begin(from);
            if (S_ISDIR(info.st_mode)) return Enter(from, to);
            const bool contents =
                hooks_.recursive || S_ISREG(info.st_mode) || S_ISLNK(info.st_mode);
            if (contents) {
                transfer_.CopyObject(from, to);
            } else {
                transfer_.CopyContents(from, to);
            }
            hooks_.on_done(from, to);
        });
    }

    void Enter(const Place& from, const Place& to) {
        Level level = {from, to, from.directory->OpenIn(from.name), nullptr, {}};
        level.made = transfer_.MakeDirectory(from, to);
        if (hooks_.recursive) level.entries = ObjectsIn(level.inside);
        // Where one of these would become metadata of another object, the object has arrived.
        std::stable_partition(level.entries.begin(), level.entries.end(),
                              [](const Directory::Entry& entry) {
                                  return !entry.name.starts_with(AppleDoubleName({}));
                              });
        levels_.push_back(std::move(level));
    }

    Transfer& transfer_;
    const TreeCopyHooks& hooks_;
    std::vector<Level> levels_;
};

}  // namespace

void CopyTree(Transfer* transfer, const Place& from, const Place& to, const TreeCopyHooks& hooks) {
    TreeCopy(transfer, hooks).Run(from, to);
}

}  // namespace mavoea::tool

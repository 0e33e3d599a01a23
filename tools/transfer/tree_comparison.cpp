#include "tools/transfer/tree_comparison.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <set>
#include <string>

#include "tools/place/volume.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

class TreeComparison {
 public:
    TreeComparison(bool recursive, const Compared& compared, const TreeReceiver& receiver)
        : recursive_(recursive), compared_(compared), receiver_(receiver) {}

    void Run(const Pair& top) {
        pending_ = {top};
        while (!pending_.empty() && !receiver_.stopped()) {
            const Pair pair = std::move(pending_.back());
            pending_.pop_back();
            receiver_.on_pair(pair);
            try {
                CompareObjects(pair);
            } catch (const Failure& failure) {
                receiver_.fails(pair, failure);
            }
        }
    }

 private:
    void CompareObjects(const Pair& pair) {
        const auto info = pair.first.Status();
        const auto there = pair.second.Status();
        if (!info && !there) throw SystemFailure(pair.first.path(), ENOENT);
        if (!info || !there) return receiver_.alone(pair, info ? Side::kFirst : Side::kSecond);
        std::vector<Difference> differences;
        Compare(ObjectAt(pair.first, &*info), ObjectAt(pair.second, &*there), compared_,
                {.differs = [&](Difference found) { differences.push_back(std::move(found)); },
                 .fails = [&](const Failure& failure) { receiver_.fails(pair, failure); },
                 .give_up = receiver_.give_up});
        receiver_.compared(pair, differences);
        if (recursive_ && S_ISDIR(info->st_mode) && S_ISDIR(there->st_mode)) AddInner(pair);
    }

    // What is pending keeps the directories open in which it is, and none besides.
    void AddInner(const Pair& pair) {
        const DirectoryRef first = pair.first.directory->OpenIn(pair.first.name);
        const DirectoryRef second = pair.second.directory->OpenIn(pair.second.name);
        std::set<std::string> names;
        for (const DirectoryRef& directory : {first, second}) {
            for (Directory::Entry& entry : ObjectsIn(directory)) {
                names.insert(std::move(entry.name));
            }
        }
        for (auto name = names.rbegin(); name != names.rend(); ++name) {
            pending_.push_back({{first, *name}, {second, *name}});
        }
    }

    const bool recursive_;
    const Compared& compared_;
    const TreeReceiver& receiver_;
    std::vector<Pair> pending_;
};

}  // namespace

void CompareTrees(const Pair& top, bool recursive, const Compared& compared,
                  const TreeReceiver& receiver) {
    TreeComparison(recursive, compared, receiver).Run(top);
}

}  // namespace mavoea::tool

#include "tools/transfer/tree_comparison.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <map>
#include <string>
#include <utility>

#include "tools/place/volume.h"
#include "tools/store/sidecars.h"
#include "tools/walk/crew.h"

namespace mavoea::tool {
namespace {

class TreeComparison {
 public:
    TreeComparison(bool recursive, const Compared& compared, CrewSize crew,
                   const TreeReceiver& receiver)
        : recursive_(recursive),
          compared_(compared),
          receiver_(receiver),
          crew_(crew,
                {.work = [this](const Errand& errand,
                                const Tell& tell) { return Work(errand, tell); },
                 .hear = receiver.add,
                 .on_failure = receiver.on_failure,
                 .clear_progress = receiver.clear_progress,
                 .show_progress =
                     [this](const Object& object) { receiver_.show_progress(object.path()); }}) {}

    void Run(const Pair& top) {
        const mode_t type = TypeOf(top.first);
        pending_ = {{top, type, type == TypeOf(top.second)}};
        while (!pending_.empty() && !receiver_.stopped()) {
            const Next next = std::move(pending_.back());
            pending_.pop_back();
            (void)crew_.Do({.kind = Errand::Kind::kPair,
                            .object = {next.pair.first},
                            .type = next.type,
                            .to = next.pair.second});
            if (recursive_ && next.same_type && S_ISDIR(next.type)) AddInner(next.pair);
        }
        crew_.Finish();
    }

 private:
    // As they were when their directories were listed.
    struct Next {
        Pair pair;
        mode_t type;  // of the first
        bool same_type;
    };

    // 0 when nothing is there, or nobody can tell: the comparison will.
    static mode_t TypeOf(const Place& place) {
        try {
            const auto info = place.Status();
            return info ? info->st_mode & S_IFMT : 0;
        } catch (const Failure&) {
            return 0;
        }
    }

    bool Work(const Errand& errand, const Tell& tell) {
        if (receiver_.stopped()) return false;
        const Pair pair = {errand.object.place, errand.to};
        try {
            CompareObjects(pair);
        } catch (const Failure& failure) {
            receiver_.fails(pair, failure);
        }
        tell(receiver_.take());
        return true;
    }

    void CompareObjects(const Pair& pair) const {
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
    }

    void AddInner(const Pair& pair) {
        try {
            ListInner(pair);
        } catch (const Failure& failure) {
            crew_.Then([=, this] {
                receiver_.fails(pair, failure);
                receiver_.add(receiver_.take());
            });
        }
    }

    // What is pending keeps the directories open in which it is, and none besides.
    void ListInner(const Pair& pair) {
        const DirectoryRef first = pair.first.directory->OpenIn(pair.first.name);
        const DirectoryRef second = pair.second.directory->OpenIn(pair.second.name);
        std::map<std::string, std::pair<mode_t, mode_t>> types;
        for (const Directory::Entry& entry : ObjectsIn(first)) types[entry.name].first = entry.type;
        for (const Directory::Entry& entry : ObjectsIn(second)) {
            types[entry.name].second = entry.type;
        }
        for (auto one = types.rbegin(); one != types.rend(); ++one) {
            const auto& [name, both] = *one;
            pending_.push_back(
                {{{first, name}, {second, name}}, both.first, both.first == both.second});
        }
    }

    const bool recursive_;
    const Compared& compared_;
    const TreeReceiver& receiver_;
    std::vector<Next> pending_;
    Crew crew_;
};

}  // namespace

void CompareTrees(const Pair& top, bool recursive, const Compared& compared, CrewSize crew,
                  const TreeReceiver& receiver) {
    TreeComparison(recursive, compared, crew, receiver).Run(top);
}

}  // namespace mavoea::tool

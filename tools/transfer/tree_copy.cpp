#include "tools/transfer/tree_copy.h"

#include <algorithm>

#include "tools/store/sidecars.h"

namespace mavoea::tool {

void TreeCopy::CopyTree(const Place& from, const Place& to) {
    Try(from, to);
    while (!levels_.empty()) {
        Level& level = levels_.back();
        if (level.next < level.entries.size() && !Stopped()) {
            const std::string name = level.entries[level.next++].name;
            Try({level.inside, name}, {level.made, name});
            continue;
        }
        const Level done = std::move(level);
        levels_.pop_back();
        try {
            Finish(done);
        } catch (const Failure& failure) {
            Fail(done.from, failure);
        }
    }
}

void TreeCopy::Try(const Place& from, const Place& to) {
    Level level = {from, to, nullptr, nullptr};
    try {
        Begin(from, to, &level);
    } catch (const Failure& failure) {
        return Fail(from, failure);
    }
    if (!level.made) return;
    // Where one of these would become metadata of another object, the object has arrived.
    std::stable_partition(
        level.entries.begin(), level.entries.end(),
        [](const Directory::Entry& entry) { return !entry.name.starts_with(AppleDoubleName({})); });
    levels_.push_back(std::move(level));
}

}  // namespace mavoea::tool

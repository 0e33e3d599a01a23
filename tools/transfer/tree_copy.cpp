#include "tools/transfer/tree_copy.h"

#include "tools/store/sidecars.h"

namespace mavoea::tool {

void TreeCopy::CopyTree(const Place& from, const Place& to) {
    Try(from, to);
    while (!levels_.empty()) {
        Level& level = levels_.back();
        if (level.next < level.entries.size() && !Stopped()) {
            TryNext(&level);
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

void TreeCopy::TryNext(Level* level) {
    const Directory::Entry entry = level->entries[level->next++];
    const Place from = {level->inside, entry.name};
    const Place to = {level->made, entry.name};
    try {
        if (!IsObject(from.directory, entry)) return;
    } catch (const Failure& failure) {
        return Fail(from, failure);
    }
    Try(from, to);
}

void TreeCopy::Try(const Place& from, const Place& to) {
    Level level = {from, to, nullptr, nullptr};
    try {
        Begin(from, to, &level);
    } catch (const Failure& failure) {
        return Fail(from, failure);
    }
    if (level.made) levels_.push_back(std::move(level));
}

}  // namespace mavoea::tool

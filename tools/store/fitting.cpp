#include "tools/store/fitting.h"

#include <algorithm>

namespace mavoea::tool {

std::string HolderOf(const WholeFile& whole) { return whole ? whole->path() : std::string(); }

void DropDamaged(Metadata* metadata) {
    if (metadata->fork && IsBlankFork(metadata->fork->value)) metadata->fork.reset();
    const auto drop = [&](const auto& item) {
        return item.value.damaged() && item.holder != HolderOf(metadata->whole_stream) &&
               item.holder != HolderOf(metadata->whole_resource);
    };
    std::erase_if(metadata->attributes, drop);
    if (metadata->finder_info && drop(*metadata->finder_info)) metadata->finder_info.reset();
    if (metadata->fork && drop(*metadata->fork)) metadata->fork.reset();
    std::erase_if(metadata->entries, [&](const auto& entry) { return drop(entry.second); });
}

void FitEntries(Metadata* metadata, std::uint32_t (*room)(EntryId), const char* where,
                std::vector<Missing>* missing) {
    std::erase_if(metadata->entries, [&](const auto& entry) {
        const auto& [id, item] = entry;
        if (item.value.size() <= room(id)) return false;
        if (!SaysSomething(id, item.value.All())) return true;
        missing->push_back(
            {NameOfEntry(id), room(id) == 0 ? std::string(where) + " has no place for it"
                                            : "it has more than the " + std::to_string(room(id)) +
                                                  " bytes that " + where + " has room for"});
        return true;
    });
}

}  // namespace mavoea::tool

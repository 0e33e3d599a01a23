#include "tools/move/backup.h"

#include <algorithm>
#include <cstdint>

namespace mavoea::tool {
namespace {

struct Word {
    const char* name;
    Backup backup;
};
constexpr Word kWords[] = {
    {"none", Backup::kNone},         {"off", Backup::kNone},          {"simple", Backup::kSimple},
    {"never", Backup::kSimple},      {"existing", Backup::kExisting}, {"nil", Backup::kExisting},
    {"numbered", Backup::kNumbered}, {"t", Backup::kNumbered},
};

// The number in "NAME.~7~"; 0 for any other name, and for numbers beyond all use.
std::uint64_t NumberOf(const std::string& entry, const std::string& name) {
    constexpr std::size_t kMostDigits = 18;
    const std::string prefix = name + ".~";
    if (!entry.starts_with(prefix) || !entry.ends_with('~')) return 0;
    if (entry.size() < prefix.size() + 2) return 0;
    const std::string digits = entry.substr(prefix.size(), entry.size() - prefix.size() - 1);
    const bool decimal = std::all_of(digits.begin(), digits.end(),
                                     [](char digit) { return digit >= '0' && digit <= '9'; });
    if (!decimal || digits.front() == '0' || digits.size() > kMostDigits) return 0;
    return std::stoull(digits);
}

}  // namespace

std::optional<Backup> BackupFromName(const std::string& name) {
    std::optional<Backup> found;
    for (const Word& word : kWords) {
        if (name == word.name) return word.backup;
        if (!std::string(word.name).starts_with(name)) continue;
        if (found && *found != word.backup) return std::nullopt;
        found = word.backup;
    }
    return name.empty() ? std::nullopt : found;
}

std::string BackupName(const Place& object, Backup backup, const std::string& suffix) {
    std::uint64_t last = 0;
    if (backup != Backup::kSimple) {
        for (const Directory::Entry& entry : object.directory->Entries()) {
            last = std::max(last, NumberOf(entry.name, object.name));
        }
    }
    if (backup == Backup::kSimple || (backup == Backup::kExisting && last == 0)) {
        return object.name + suffix;
    }
    return object.name + ".~" + std::to_string(last + 1) + '~';
}

}  // namespace mavoea::tool

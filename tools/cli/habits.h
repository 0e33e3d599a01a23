// The command lines of cp, mv and rm, which are those of the coreutils commands of these names.
#ifndef MAVOEA_TOOLS_CLI_HABITS_H_
#define MAVOEA_TOOLS_CLI_HABITS_H_

#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "tools/cli/words.h"
#include "tools/move/options.h"

namespace mavoea::tool {

enum class Habit { kCopy, kMove, kDelete };

struct HabitOptions {
    CopyOptions copy;  // cp and mv
    RemoveOptions remove;
    std::vector<std::string> volumes;  // PATH=TYPE
    std::string progress;              // seconds, empty: none
    bool json = false;
    bool dry_run = false;
};

// What the words behind the command's say, or the exit status when everything has been said. The
// tool's own help ends with the command's `examples`.
std::variant<HabitOptions, int> ParseHabit(Habit habit, std::span<const char* const> words,
                                           std::string (*examples)(std::string_view command));

std::vector<OptionWords> OptionsOf(Habit habit);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CLI_HABITS_H_

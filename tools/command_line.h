// The command line, parsed.
#ifndef MAVOEA_TOOLS_COMMAND_LINE_H_
#define MAVOEA_TOOLS_COMMAND_LINE_H_

#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace mavoea::tool {

enum class Command {
    kWhere,
    kList,
    kGet,
    kSet,
    kRemove,
    kLock,
    kUnlock,
    kImport,
    kUpgrade,
    kRepair,
    kDump
};

struct Options {
    Command command = Command::kWhere;
    std::vector<std::string> volumes;  // PATH=TYPE
    bool json = false;

    std::vector<std::string> paths;  // one, but for list, lock, unlock, upgrade and repair
    std::string name;
    std::string apple_double;          // import
    bool details = false;              // list -l
    bool recursive = false;            // upgrade, repair
    bool record = false;               // dump: the record of an object
    bool hex = false;                  // get, set
    std::optional<std::string> value;  // set: none of the two means standard input
    std::optional<std::string> file;
};

// What to do, or the exit status when everything has been said: help, version, or what is wrong
// with the command line.
std::variant<Options, int> ParseCommandLine(int argc, const char* const* argv);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_COMMAND_LINE_H_

// The command line, parsed.
#ifndef MAVOEA_TOOLS_CLI_COMMAND_LINE_H_
#define MAVOEA_TOOLS_CLI_COMMAND_LINE_H_

#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "tools/cli/set_info.h"
#include "tools/cli/words.h"
#include "tools/move/options.h"
#include "tools/place/paths.h"
#include "tools/walk/journal.h"
#include "tools/walk/shard.h"

namespace mavoea::tool {

enum class Command {
    kWhere,
    kList,
    kShow,
    kGet,
    kSet,
    kSetInfo,
    kRemove,
    kLock,
    kUnlock,
    kImport,
    kExport,
    kSave,
    kRestore,
    kCopy,
    kMove,
    kDelete,
    kCarry,
    kUpgrade,
    kRepair,
    kClean,
    kCheck,
    kConvert,
    kPlan,
    kDiff,
    kDump,
    kSalvage
};

struct Options {
    Command command = Command::kWhere;
    int wait = 2;                      // clean: seconds between its two looks
    std::vector<std::string> volumes;  // PATH=TYPE

    NamedPaths paths;         // one argument, but for commands that take any number
    Shard shard;              // of the objects that those lead to
    unsigned jobs = 0;        // list, show, check: processes, 0 as many as is usual
    std::string destination;  // convert, carry, salvage; diff: the second
    std::string directory;    // restore
    std::string archive;      // import, export, restore
    std::string name;
    std::string format;                   // export
    std::string to;                       // convert: the destination's volume type
    std::string color = "auto";           // check, diff
    std::string progress;                 // seconds between two lines of it, empty: none
    std::optional<std::string> value;     // set: none of the two means standard input
    std::optional<std::string> file;      // the same
    std::optional<std::string> type;      // restore: of the volume that the text was made of
    std::optional<std::string> encoding;  // save
    std::optional<std::string> output;    // save, plan
    std::optional<LogFile> log;           // check, convert, upgrade, repair
    std::optional<std::string> plan;  // convert: does what it says, and takes no other arguments

    InfoOptions info;      // set-info
    CopyOptions copy;      // cp, mv
    RemoveOptions remove;  // rm

    bool json = false;
    bool recursive = false;
    bool verbose = false;
    bool dry_run = false;
    bool force = false;           // export, save, plan
    bool replaces_data = false;   // import
    bool keep = false;            // import -r: the "._" files stay
    bool keep_existing = false;   // import -r: values that are there stay
    bool details = false;         // list -l
    bool null = false;            // list
    bool values = false;          // list
    bool yes = false;             // clean: what is listed is removed; check: what was replaced
    bool repair = false;          // check
    bool all = false;             // clean: things of other services, too
    bool absolute_names = false;  // save, restore
    bool data = false;            // diff
    bool brief = false;           // diff
    bool itemized = false;        // diff
    bool record = false;          // dump: the record of an object
    bool attributes = false;      // dump: what other programs keep of an object
    bool hex = false;             // get, set
    bool raw = false;             // get: to a terminal, too
    bool escaped = false;         // get, set, remove: the name is as list shows it
};

// What to do, or the exit status when everything has been said: help, version, or what is wrong
// with the command line. A program that is called cp, mv or rm is that command. Throws Failure for
// a command that is none.
std::variant<Options, int> ParseCommandLine(int argc, const char* const* argv);

// Names of commands, and what they do.
std::vector<CommandWords> AllCommands();
// With the options and operands of one; without a name, the options that stand before it.
CommandWords WordsOf(std::string_view command);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CLI_COMMAND_LINE_H_

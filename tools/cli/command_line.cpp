#include "tools/cli/command_line.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <iostream>
#include <span>
#include <string_view>

#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr const char* kExamples = R"(Examples:
  mavoea --volume /srv/share=eadir where /srv/share/letter.txt
  mavoea set letter.txt com.example.colour blue
  mavoea set letter.txt com.apple.ResourceFork --file letter.rsrc
  mavoea get letter.txt com.apple.FinderInfo --hex
  mavoea list -l letter.txt
  mavoea remove letter.txt com.example.colour
  mavoea lock letter.txt
  mavoea import ._letter.txt letter.txt
  mavoea cp -r /srv/share/letters /mnt/share
  mavoea mv letter.txt /mnt/share
  mavoea rm -r /srv/share/letters
  mavoea upgrade -r /srv/share
  mavoea repair -r /srv/share
  mavoea clean -r /srv/share
  mavoea convert -r --to appledouble /srv/share /mnt/share
  mavoea dump @eaDir/letter.txt@MavoEAStream
  mavoea dump --record letter.txt

Volume types: a number from 0 to 12, or appledouble (0), eadir (1), fileea (2), xattr (7).
Names like any other: com.apple.FinderInfo, com.apple.ResourceFork, and mavoea.locked, which is 1
for a file that Macs may not write, rename or delete.
Recursive work goes on after a failure, and tells at its end what failed.
Exit status: 0 done; 1 not found, the object or the attribute; 2 anything else that went wrong;
130 and 143: cp, mv or rm was interrupted, after the object in hand.
A NAME or VALUE that begins with '-' stands behind "--". Control characters in names are shown as
"\x0A", backslashes doubled; --json has names as they are.)";

// CLI11 takes "[a,b]" apart where an option has several values. A byte in front keeps it whole.
constexpr char kGuard = '\x01';

std::string Guarded(const char* argument) {
    const bool needed = *argument == '[' || *argument == kGuard;
    return needed ? kGuard + std::string(argument) : argument;
}

std::string Unguarded(std::string argument) {
    if (!argument.empty() && argument.front() == kGuard) argument.erase(0, 1);
    return argument;
}

void AddPath(CLI::App* sub, Options* options, const char* what) {
    sub->add_option_function<std::string>(
           "PATH", [=](const std::string& path) { options->paths = {path}; }, what)
        ->required();
}

void AddPaths(CLI::App* sub, Options* options) {
    sub->add_option("PATH", options->paths, "Files and directories")->required();
}

void AddRecursive(CLI::App* sub, Options* options) {
    sub->add_flag("-r,--recursive", options->recursive,
                  "With all that is below directories; symbolic links are not followed");
}

void AddTree(CLI::App* sub, Options* options) {
    AddRecursive(sub, options);
    AddPaths(sub, options);
}

void AddAllowLoss(CLI::App* sub, Options* options) {
    sub->add_flag("--allow-loss", options->allow_loss,
                  "What cannot be kept at the destination is named, and may be lost");
}

// Of two that contradict each other the last counts.
void AddConsent(CLI::App* sub, const char* flag, Consent consent, Options* options,
                const char* what) {
    sub->add_flag_callback(
           flag, [=] { options->consent = consent; }, what)
        ->trigger_on_parse();
}

// What cp, mv and rm share.
void AddHabits(CLI::App* sub, Options* options) {
    AddConsent(sub, "-i,--interactive", Consent::kAsk, options, "Ask before anything is lost");
    AddConsent(sub, "-f,--force", Consent::kForce, options, "Never ask");
    sub->add_flag("-v,--verbose", options->verbose, "Say what is done");
}

// What cp and mv share.
void AddDestination(CLI::App* sub, Options* options) {
    AddHabits(sub, options);
    AddAllowLoss(sub, options);
    AddConsent(sub, "-n,--no-clobber", Consent::kNever, options, "Leave alone what is there");
    CLI::Option* const directory =
        sub->add_option_function<std::string>(
               "-t,--target-directory",
               [=](const std::string& path) { options->target_directory = path; },
               "The directory to put all of them into")
            ->type_name("DIR");
    sub->add_flag("-T,--no-target-directory", options->no_target_directory,
                  "DST is the new object itself, never the directory to put it into")
        ->excludes(directory);
    sub->add_option("PATH", options->paths, "SRC... DST, or SRC... with -t")->required();
}

void AddName(CLI::App* sub, Options* options) {
    sub->add_option("NAME", options->name, "The attribute's name")->required();
}

struct Syntax {
    Command command;
    const char* name;
    const char* what;
    void (*add_arguments)(CLI::App* sub, Options* options);
};

constexpr Syntax kCommands[] = {
    {Command::kWhere, "where", "Show the volume's type and every place where metadata may lie",
     [](CLI::App* sub, Options* options) { AddPath(sub, options, "A file or directory"); }},
    {Command::kList, "list", "List attribute names, one a line",
     [](CLI::App* sub, Options* options) {
         sub->add_flag("-l", options->details, "With size, kind and the file that holds it");
         AddRecursive(sub, options);
         AddPaths(sub, options);
     }},
    {Command::kGet, "get", "Write a value to standard output",
     [](CLI::App* sub, Options* options) {
         sub->add_flag("--hex", options->hex, "As a hex dump");
         AddPath(sub, options, "A file or directory");
         AddName(sub, options);
     }},
    {Command::kSet, "set", "Set an attribute to VALUE, a file's bytes or standard input",
     [](CLI::App* sub, Options* options) {
         AddPath(sub, options, "A file or directory");
         AddName(sub, options);
         CLI::Option* const value = sub->add_option_function<std::string>(
             "VALUE", [=](const std::string& text) { options->value = text; }, "The value's bytes");
         sub->add_option_function<std::string>(
                "--file", [=](const std::string& file) { options->file = file; },
                "Take the value from a file")
             ->type_name("FILE")
             ->excludes(value);
         sub->add_flag("--hex", options->hex, "VALUE is hexadecimal digits")->needs(value);
     }},
    {Command::kRemove, "remove", "Remove an attribute",
     [](CLI::App* sub, Options* options) {
         AddPath(sub, options, "A file or directory");
         AddName(sub, options);
     }},
    {Command::kLock, "lock", "Lock files: Macs may not write, rename or delete them", AddTree},
    {Command::kUnlock, "unlock", "Unlock files", AddTree},
    {Command::kImport, "import",
     "Give an object the attributes, Finder info and resource fork of a \"._\" file",
     [](CLI::App* sub, Options* options) {
         sub->add_option("APPLEDOUBLE", options->apple_double, "An AppleDouble file")->required();
         AddPath(sub, options, "A file or directory");
     }},
    {Command::kCopy, "cp", "Copy objects with data, permissions, times and metadata",
     [](CLI::App* sub, Options* options) {
         sub->add_flag("-r,-R,-a,--recursive", options->recursive,
                       "With all that is below directories; symbolic links are copied as such");
         sub->add_flag_callback(
             "-p,--preserve", [] {}, "Keep mode, owner and times, as is always done");
         AddDestination(sub, options);
     }},
    {Command::kMove, "mv", "Move or rename objects with their metadata", AddDestination},
    {Command::kDelete, "rm", "Remove objects with their metadata",
     [](CLI::App* sub, Options* options) {
         sub->add_flag("-r,-R,--recursive", options->recursive,
                       "With all that is in directories; symbolic links are not followed");
         AddHabits(sub, options);
         AddPaths(sub, options);
     }},
    {Command::kUpgrade, "upgrade", "Convert what earlier versions kept into the current layout",
     AddTree},
    {Command::kRepair, "repair", "Move what resource files wrongly hold into EA streams", AddTree},
    {Command::kClean, "clean", "List metadata whose object is gone, and remove it with --yes",
     [](CLI::App* sub, Options* options) {
         AddRecursive(sub, options);
         sub->add_flag("--yes", options->yes, "Remove what is listed");
         sub->add_flag("--all", options->all,
                       "With what other services keep in EA directories for objects that are gone");
         sub->add_option("DIR", options->paths, "Directories")->required();
     }},
    {Command::kConvert, "convert",
     "Copy an object or a tree to a volume of another type, and compare the two",
     [](CLI::App* sub, Options* options) {
         AddRecursive(sub, options);
         sub->add_option("--to", options->to, "The type of DST's volume")
             ->type_name("TYPE")
             ->required();
         AddAllowLoss(sub, options);
         sub->add_flag("--compare-only", options->compare_only, "Copy nothing, only compare");
         sub->add_option_function<std::string>(
                "SRC", [=](const std::string& path) { options->paths = {path}; }, "What to copy")
             ->required();
         sub->add_option("DST", options->destination,
                         "The copy's own path, not that of the directory around it")
             ->required();
     }},
    {Command::kDump, "dump", "Show and check every field of an EA stream or AppleDouble file",
     [](CLI::App* sub, Options* options) {
         sub->add_flag("--record", options->record,
                       "FILE is an object, whose netatalk record is shown");
         sub->add_option_function<std::string>(
                "FILE", [=](const std::string& path) { options->paths = {path}; },
                "A metadata file")
             ->required();
     }},
};

// ---- Commands that are none ---------------------------------------------------------------------

// How many letters must be put in, left out, changed or swapped with their neighbours.
std::size_t Distance(std::string_view one, std::string_view other) {
    std::vector<std::vector<std::size_t>> table(one.size() + 1,
                                                std::vector<std::size_t>(other.size() + 1));
    for (std::size_t i = 0; i <= one.size(); ++i) {
        for (std::size_t j = 0; j <= other.size(); ++j) {
            if (i == 0 || j == 0) {
                table[i][j] = i + j;
                continue;
            }
            const std::size_t changed = table[i - 1][j - 1] + (one[i - 1] == other[j - 1] ? 0 : 1);
            table[i][j] = std::min({table[i - 1][j] + 1, table[i][j - 1] + 1, changed});
            if (i > 1 && j > 1 && one[i - 1] == other[j - 2] && one[i - 2] == other[j - 1]) {
                table[i][j] = std::min(table[i][j], table[i - 2][j - 2] + 1);
            }
        }
    }
    return table[one.size()][other.size()];
}

// The first word that is no option and no value of one; none when it is a command, or missing.
std::optional<std::string> UnknownCommand(std::span<const char* const> arguments) {
    for (std::size_t i = 0; i < arguments.size(); ++i) {
        const std::string_view word = arguments[i];
        if (word == "--volume") {
            ++i;
        } else if (!word.starts_with('-')) {
            const bool known = std::any_of(std::begin(kCommands), std::end(kCommands),
                                           [&](const Syntax& one) { return one.name == word; });
            if (known) return std::nullopt;
            return std::string(word);
        } else if (word != "--json" && !word.starts_with("--volume=")) {
            return std::nullopt;
        }
    }
    return std::nullopt;
}

Failure NoCommand(const std::string& word) {
    const char* nearest = nullptr;
    std::size_t least = 3;  // more changes than that make another word
    for (const Syntax& one : kCommands) {
        const std::size_t distance = Distance(word, one.name);
        const bool begins =
            word.starts_with(one.name) || std::string_view(one.name).starts_with(word);
        // Of a short word most letters would have to change.
        if (!begins && distance * 2 > std::max(word.size(), std::string_view(one.name).size())) {
            continue;
        }
        if (distance > least || (distance == least && nearest != nullptr)) continue;
        least = distance;
        nearest = one.name;
    }
    std::string cause = "unknown command";
    if (nearest != nullptr) cause += std::string(", the nearest is \"") + nearest + '"';
    return {kFailed, word, cause, "mavoea --help has all of them"};
}

}  // namespace

std::variant<Options, int> ParseCommandLine(int argc, const char* const* argv) {
    Options options;
    CLI::App app(
        "Shows and changes the Mac and SMB metadata of files: named attributes, resource "
        "forks, Finder info.",
        "mavoea");
    app.require_subcommand(1);
    app.fallthrough();
    app.set_version_flag("--version", "mavoea " MAVOEA_VERSION, "Show the version");
    app.add_flag("--json", options.json, "Write JSON; bytes are hexadecimal digits");
    app.add_option("--volume", options.volumes,
                   "Declare a directory's volume type for this run; may be repeated")
        ->type_name("PATH=TYPE")
        ->expected(1)
        ->allow_extra_args(false)
        ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);

    const std::span<const char* const> arguments(argv + 1, argv + std::max(argc, 1));
    if (const auto word = UnknownCommand(arguments)) throw NoCommand(*word);
    for (const Syntax& syntax : kCommands) {
        CLI::App* const sub = app.add_subcommand(syntax.name, syntax.what);
        sub->callback([&options, &syntax] { options.command = syntax.command; });
        // Whoever does not name a command does without its arguments, which take longer to set up
        // than many a command to run.
        const std::string_view name = syntax.name;
        if (std::find(arguments.begin(), arguments.end(), name) != arguments.end()) {
            syntax.add_arguments(sub, &options);
        }
    }

    app.footer(kExamples);
    try {
        std::vector<std::string> last_first;
        for (int i = argc - 1; i > 0; --i) last_first.push_back(Guarded(argv[i]));
        app.parse(std::move(last_first));
    } catch (const CLI::Success& success) {
        return app.exit(success);
    } catch (const CLI::ParseError& error) {
        std::cerr << "mavoea: " << error.what() << "; mavoea --help has the usage\n";
        return static_cast<int>(kFailed);
    }
    for (std::string& path : options.paths) path = Unguarded(std::move(path));
    for (std::string& volume : options.volumes) volume = Unguarded(std::move(volume));
    options.name = Unguarded(std::move(options.name));
    options.apple_double = Unguarded(std::move(options.apple_double));
    options.destination = Unguarded(std::move(options.destination));
    options.to = Unguarded(std::move(options.to));
    if (options.target_directory) {
        options.target_directory = Unguarded(*std::move(options.target_directory));
    }
    if (options.value) options.value = Unguarded(*std::move(options.value));
    if (options.file) options.file = Unguarded(*std::move(options.file));
    return options;
}

}  // namespace mavoea::tool

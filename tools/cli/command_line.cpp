#include "tools/cli/command_line.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <array>
#include <iostream>
#include <span>
#include <sstream>
#include <string_view>

#include "tools/care/finding.h"
#include "tools/care/mending.h"
#include "tools/cli/completion.h"
#include "tools/cli/habits.h"
#include "tools/say/messages.h"
#include "tools/say/output.h"

namespace mavoea::tool {
namespace {

constexpr const char* kExamples = R"(Examples:
  mavoea --volume /srv/share=eadir where /srv/share/letter.txt
  mavoea set letter.txt com.example.colour blue
  mavoea set letter.txt com.apple.ResourceFork --file letter.rsrc
  mavoea set-info letter.txt --type TEXT --flags invisible,-stationery --tags Letters:red,Home
  mavoea get letter.txt com.apple.FinderInfo --hex
  mavoea list -l letter.txt
  mavoea list -r --json --values /srv/share
  mavoea show letter.txt
  mavoea remove letter.txt com.example.colour
  mavoea lock letter.txt
  mavoea unlock -r /srv/share
  mavoea import ._letter.txt letter.txt
  mavoea import letter.hqx /srv/share
  mavoea import -r /srv/share/unpacked
  mavoea export --format macbinary letter.txt letter.bin
  mavoea save -r /srv/share --output share.txt
  mavoea restore --directory / share.txt
  mavoea cp -r /srv/share/letters /mnt/share
  mavoea mv letter.txt /mnt/share
  mavoea rm -r /srv/share/letters
  mavoea carry -r /srv/share/letters /mnt/restored/letters
  mavoea upgrade -r --shard 3/16 /srv/share
  find /srv/share -name '*.psd' -print0 | mavoea lock --files0-from -
  mavoea repair -r /srv/share
  mavoea clean -r /srv/share
  mavoea check -r /srv/share
  mavoea check -r --repair /srv/share
  mavoea plan -r --to samba /srv/share /mnt/share
  mavoea plan -r --to samba --output share.plan /srv/share /mnt/share
  mavoea convert --plan share.plan
  mavoea convert -r --to appledouble /srv/share /mnt/share
  mavoea diff -r /srv/share /mnt/share
  mavoea dump @eaDir/letter.txt@MavoEAStream
  mavoea dump --record letter.txt
  mavoea dump --attributes letter.txt
  mavoea salvage letter.txt /tmp/salvaged

Volume types: a number from 0 to 12, or appledouble (0), eadir (1), fileea (2), xattr (7); and what
other programs keep: samba, samba-stream, samba-all-streams, netatalk, netatalk-samba, linux.
Names like any other: com.apple.FinderInfo, com.apple.ResourceFork, and mavoea.locked, which is 1
for a file that Macs may not write, rename or delete.
Recursive work goes on after a failure, and tells at its end what failed.
Exit status: 0 done; 1 not found, the object or the attribute; 2 anything else that went wrong.
Of check: 0 sound; 1 something was found; 2 something could not be looked at.
Of cp, mv and rm: 1 something could not be done; 2 all objects arrived, and not all metadata; 130 and
143 interrupted, after the object in hand. Under the names cp, mv and rm the tool is that command.
A NAME or VALUE that begins with '-' stands behind "--". Control characters in names are shown as
"\x0A", backslashes doubled, and --escaped takes them so; --json has names as they are.)";

// Those of the examples that call a command, under their title.
std::string ExamplesOf(std::string_view command) {
    std::string found;
    std::istringstream lines(kExamples);
    for (std::string line; std::getline(lines, line) && !line.empty();) {
        std::istringstream words(line);
        std::string word;
        while (words >> word && word != "mavoea") {
        }
        while (words >> word && word == "--volume") words >> word;
        if (words && word == command) found += '\n' + line;
    }
    return found.empty() ? found : "Examples:" + found;
}

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
           "PATH", [=](const std::string& path) { options->paths.arguments = {path}; }, what)
        ->required();
}

// Any number of them, for a PathReader.
void AddPaths(CLI::App* sub, Options* options, const char* name, const char* what) {
    CLI::Option* const paths = sub->add_option(name, options->paths.arguments, what)->required();
    sub->add_option_function<std::string>(
           "--files0-from",
           [=](const std::string& file) {
               options->paths.list = Unguarded(file);
               paths->required(false);
           },
           std::string("Take each ") + name +
               " from a file that has a NUL behind each; \"-\": standard input")
        ->type_name("FILE")
        ->excludes(paths);
}

void AddRecursive(CLI::App* sub, Options* options) {
    sub->add_flag("-r,--recursive", options->recursive,
                  "With all that is below directories; symbolic links are not followed");
    // A flag's value stands behind "=" only: a PATH is never taken for it.
    constexpr int kDay = 86400;
    sub->add_flag(
           "--progress{30}", options->progress,
           "Tell how far it is each 30 s, or \"--progress=SECONDS\" each so many, 0 with each "
           "object, where no terminal shows it; SIGUSR1 asks for it at any time")
        ->check(CLI::Range(0, kDay));
}

// Objects for the walk through trees, or a part of them.
void AddTree(CLI::App* sub, Options* options) {
    AddRecursive(sub, options);
    sub->add_option_function<std::string>(
           "--shard",
           [=](const std::string& text) {
               const auto shard = ParseShard(text);
               if (!shard) throw CLI::ValidationError("--shard", text + " is no I/N");
               options->shard = *shard;
           },
           "Only the objects of the I-th of N parts, for N processes that share the work")
        ->type_name("I/N");
    AddPaths(sub, options, "PATH", "Files and directories");
}

// Of commands that change things, and have said before what they say of it.
void AddDryRunOnly(CLI::App* sub, Options* options) {
    sub->add_flag("-n,--dry-run", options->dry_run,
                  "Say that, as far as it is known before, and change nothing");
}

void AddDryRun(CLI::App* sub, Options* options) {
    sub->add_flag("-v,--verbose", options->verbose, "Say what becomes of each object");
    AddDryRunOnly(sub, options);
}

// For what several processes can do.
void AddJobs(CLI::App* sub, Options* options) {
    constexpr unsigned kMost = 256;
    sub->add_option("-j,--jobs", options->jobs,
                    "By so many processes; without it one for each processor, at most 8, where "
                    "there is enough to do")
        ->type_name("N")
        ->check(CLI::Range(1U, kMost));
}

void AddSharedTree(CLI::App* sub, Options* options) {
    AddJobs(sub, options);
    AddTree(sub, options);
}

// For work that may take more than a night.
void AddLog(CLI::App* sub, Options* options) {
    const auto add = [&](const char* name, bool resumes, const char* text) {
        return sub
            ->add_option_function<std::string>(
                name,
                [=](const std::string& path) {
                    options->log = LogFile{.path = path, .resumes = resumes};
                },
                text)
            ->type_name("FILE");
    };
    CLI::Option* const log =
        add("--log", false, "Write into a new file what is done, for a run that goes on with it");
    add("--resume", true, "Go on with that file: only what it does not have as done is done")
        ->excludes(log);
}

void AddLoggedTree(CLI::App* sub, Options* options) {
    AddLog(sub, options);
    AddSharedTree(sub, options);
}

void AddTreeToChange(CLI::App* sub, Options* options) {
    AddDryRun(sub, options);
    AddSharedTree(sub, options);
}

// A dry run does nothing that a log could have as done.
void KeepDryRunsUnlogged(CLI::App* sub) {
    for (const char* name : {"--log", "--resume"}) {
        sub->get_option(name)->excludes(sub->get_option("--dry-run"));
    }
}

void AddLoggedTreeToChange(CLI::App* sub, Options* options) {
    AddDryRun(sub, options);
    AddLoggedTree(sub, options);
    KeepDryRunsUnlogged(sub);
}

CLI::Option* AddSource(CLI::App* sub, Options* options) {
    return sub->add_option_function<std::string>(
        "SRC", [=](const std::string& path) { options->paths.arguments = {path}; }, "The original");
}

// What a conversion takes: the type, the source and the copy.
std::array<CLI::Option*, 3> AddConversion(CLI::App* sub, Options* options) {
    AddRecursive(sub, options);
    CLI::Option* const type = sub->add_option("--to", options->to, "The type of DST's volume");
    type->type_name("TYPE");
    CLI::Option* const source = AddSource(sub, options);
    CLI::Option* const copy = sub->add_option(
        "DST", options->destination, "The copy's own path, not that of the directory around it");
    return {type, source, copy};
}

// Their arguments are read elsewhere.
void AddNothing(CLI::App* /*sub*/, Options* /*options*/) {}

void AddName(CLI::App* sub, Options* options) {
    sub->add_option("NAME", options->name, "The attribute's name")->required();
    sub->add_flag("--escaped", options->escaped,
                  "NAME is as list shows it: \"\\x0A\" and its like, backslashes doubled");
}

constexpr const char* kSetInfoWhat =
    "Change Finder info, comment, tags and dates; all that is not named stays. A comment goes to "
    "the "
    "attribute of Macs and, where a volume keeps records, to the record, which has room for 200 "
    "bytes. Tags without --label make the label the colour of the first one that has a colour";

void AddText(CLI::App* sub, std::optional<std::string>* into, const char* option, const char* type,
             const char* what) {
    sub->add_option_function<std::string>(
           option, [=](const std::string& text) { *into = text; }, what)
        ->type_name(type);
}

void AddTexts(CLI::App* sub, std::vector<std::string>* into, const char* option, const char* type,
              const char* what) {
    sub->add_option(option, *into, what)
        ->type_name(type)
        ->expected(1)
        ->allow_extra_args(false)
        ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
}

void AddInfo(CLI::App* sub, Options* options) {
    InfoOptions* const info = &options->info;
    AddText(sub, &info->type, "--type", "TEXT4",
            "A file's type, four letters; \"\\x00\" is a byte");
    AddText(sub, &info->creator, "--creator", "TEXT4", "A file's creator");
    AddText(sub, &info->label, "--label", "NAME",
            "none, grey, green, purple, blue, yellow, red, orange, or 0 to 7; tags stay");
    AddText(sub, &info->flags, "--flags", "LIST",
            "Flags to set, as show has them, and with a '-' in front to clear: invisible,-shared");
    AddText(sub, &info->comment, "--comment", "TEXT", "The Finder's comment; \"\": none");
    AddText(sub, &info->tags, "--tags", "LIST", "All tags, as NAME or NAME:COLOUR; \"\": none");
    AddTexts(sub, &info->added_tags, "--tag", "TAG", "One tag more; may be repeated");
    AddTexts(sub, &info->removed_tags, "--untag", "NAME", "One tag less; may be repeated");
    AddText(sub, &info->backed_up, "--backup-date", "DATE",
            "When it was backed up, in UTC: 2024-05-01T09:30:00Z");
    AddText(sub, &info->created, "--created", "DATE", "When it was made, as Macs show it");
    AddDryRun(sub, options);
    AddPaths(sub, options, "PATH", "Files and directories");
}

// Of one file there is one object; all arguments are directories in recursive work.
void PlaceImport(Options* options) {
    std::vector<std::string>& paths = options->paths.arguments;
    if (options->recursive) {
        paths.insert(paths.begin(), options->archive);
    } else if (paths.empty()) {
        throw CLI::RequiredError("PATH");
    } else if (paths.size() > 1) {
        throw CLI::ExtrasError({Unguarded(paths[1])});
    }
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
         CLI::Option* const details =
             sub->add_flag("-l", options->details, "With size, kind and the file that holds it");
         sub->add_flag("-0,--null", options->null,
                       "For each attribute the object's path and the name, as they are, with a NUL "
                       "behind each")
             ->excludes(details);
         sub->add_flag("--values", options->values, "With --json: values, too, as base64");
         AddSharedTree(sub, options);
     }},
    {Command::kShow, "show",
     "Show in words what is known: Finder info, comment, tags, dates, marks, attributes",
     AddSharedTree},
    {Command::kGet, "get", "Write a value to standard output",
     [](CLI::App* sub, Options* options) {
         CLI::Option* const hex = sub->add_flag("--hex", options->hex, "As a hex dump");
         sub->add_flag("--raw", options->raw, "As it is, to a terminal, too")->excludes(hex);
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
         sub->add_flag(
                "--hex", options->hex,
                "VALUE is hexadecimal digits, behind \"0x\" or not; blanks and colons between "
                "pairs are left out")
             ->needs(value);
         AddDryRun(sub, options);
     }},
    {Command::kSetInfo, "set-info", kSetInfoWhat, AddInfo},
    {Command::kRemove, "remove", "Remove an attribute",
     [](CLI::App* sub, Options* options) {
         AddDryRun(sub, options);
         AddPath(sub, options, "A file or directory");
         AddName(sub, options);
     }},
    {Command::kLock, "lock", "Lock files: Macs may not write, rename or delete them",
     AddTreeToChange},
    {Command::kUnlock, "unlock", "Unlock files", AddTreeToChange},
    {Command::kImport, "import",
     "Give an object the metadata in an AppleDouble (\"._\"), AppleSingle, MacBinary or BinHex "
     "file",
     [](CLI::App* sub, Options* options) {
         sub->add_option("FILE", options->archive, "The file; its content says what it is")
             ->required();
         sub->add_option("PATH", options->paths.arguments,
                         "The object. All but AppleDouble hold data as well: they make a file that "
                         "is missing, in a directory one of their own name, and are refused where "
                         "there is other data");
         CLI::Option* const data = sub->add_flag("--data", options->replaces_data,
                                                 "Replace other data by what FILE holds");
         CLI::Option* const tree =
             sub->add_flag("-r,--recursive", options->recursive,
                           "FILE and PATH are directories: each \"._\" file below them goes onto "
                           "the object beside it, or that a folder \"__MACOSX\" has it for, and is "
                           "removed when it has arrived")
                 ->excludes(data);
         sub->add_flag("--keep", options->keep, "The \"._\" files stay")->needs(tree);
         sub->add_flag("--keep-existing", options->keep_existing,
                       "Values that an object has are not replaced; a file with others stays")
             ->needs(tree);
         AddDryRun(sub, options);
     }},
    {Command::kExport, "export", "Write an object's metadata into a file as Macs have them",
     [](CLI::App* sub, Options* options) {
         sub->add_option("--format", options->format,
                         "appledouble (metadata only), or with the data applesingle, macbinary, "
                         "binhex")
             ->type_name("FORMAT")
             ->default_val("appledouble");
         sub->add_flag("-f,--force", options->force, "Replace a FILE that is there");
         AddDryRun(sub, options);
         AddPath(sub, options, "A file or directory");
         sub->add_option("FILE", options->archive, "A new file; \"-\": standard output")
             ->required();
     }},
    {Command::kSave, "save", "Write metadata as text, as getfattr --dump does",
     [](CLI::App* sub, Options* options) {
         AddRecursive(sub, options);
         sub->add_option("--encoding", options->encoding,
                         "Of all values: text, hex or base64; for each the one that shows it best")
             ->type_name("ENCODING");
         sub->add_option("--output", options->output, "A new file, in place of standard output")
             ->type_name("FILE");
         sub->add_flag("-f,--force", options->force, "Replace a FILE that is there");
         sub->add_flag("--absolute-names", options->absolute_names,
                       "Leave the slashes at the beginning of paths");
         AddPaths(sub, options, "PATH", "Files and directories");
     }},
    {Command::kRestore, "restore", "Give objects the metadata in a text of save or getfattr --dump",
     [](CLI::App* sub, Options* options) {
         sub->add_option("--directory", options->directory, "Where the paths in the text begin")
             ->type_name("DIR")
             ->default_val(".");
         sub->add_option("--from", options->type,
                         "The volume that getfattr was run on, where its attributes' names do not "
                         "tell: netatalk-samba, xattr, ...")
             ->type_name("TYPE");
         sub->add_flag("--absolute-names", options->absolute_names,
                       "Follow paths that begin with a slash from the root");
         sub->add_flag("-v,--verbose", options->verbose, "Say what is done");
         AddDryRunOnly(sub, options);
         sub->add_option("FILE", options->archive, "The text; \"-\": standard input")
             ->default_val("-");
     }},
    {Command::kCopy, "cp", "Copy objects with their metadata, with the options of cp", AddNothing},
    {Command::kMove, "mv", "Move or rename objects with their metadata, with the options of mv",
     AddNothing},
    {Command::kDelete, "rm", "Remove objects with their metadata, with the options of rm",
     AddNothing},
    {Command::kCarry, "carry", "Give a copy that another program has made the original's metadata",
     [](CLI::App* sub, Options* options) {
         AddRecursive(sub, options);
         sub->add_flag("-v,--verbose", options->verbose, "Say what is done");
         AddDryRunOnly(sub, options);
         AddSource(sub, options)->required();
         sub->add_option("DST", options->destination, "The copy's own path")->required();
     }},
    {Command::kUpgrade, "upgrade", "Convert what earlier versions kept into the current layout",
     AddLoggedTreeToChange},
    {Command::kRepair, "repair", "Move what resource files wrongly hold into EA streams",
     AddLoggedTreeToChange},
    {Command::kClean, "clean", "List metadata whose object is gone, and remove it with --yes",
     [](CLI::App* sub, Options* options) {
         AddRecursive(sub, options);
         CLI::Option* const yes = sub->add_flag(
             "--yes", options->yes, "Remove what is listed, when a second look finds it");
         AddDryRunOnly(sub, options);
         sub->get_option("--dry-run")->needs(yes);
         sub->add_option("--wait", options->wait,
                         "How long after the first look the second one comes; 0: at once")
             ->type_name("SECONDS")
             ->check(CLI::Range(0, 3600))
             ->capture_default_str();
         sub->add_flag("--all", options->all,
                       "With what other services keep in EA directories for objects that are gone");
         AddPaths(sub, options, "DIR", "Directories");
     }},
    {Command::kCheck, "check",
     "Say whether all that is known of objects is sound; change nothing, but with --repair",
     [](CLI::App* sub, Options* options) {
         sub->add_flag("-v,--verbose", options->verbose, "Say at the end how many there were");
         CLI::Option* const repair =
             sub->add_flag("--repair", options->repair,
                           "Mend what can be mended without loss; what is replaced is kept beside "
                           "it");
         sub->add_flag("--yes", options->yes,
                       "What repairs have replaced goes, where the object has all that it holds")
             ->needs(repair);
         sub->footer(MendingText() + '\n' + FindingCodes());
         AddDryRunOnly(sub, options);
         sub->get_option("--dry-run")->needs(repair);
         AddLoggedTree(sub, options);
         KeepDryRunsUnlogged(sub);
     }},
    {Command::kConvert, "convert",
     "Copy an object or a tree to a volume of another type, and compare the two",
     [](CLI::App* sub, Options* options) {
         AddDryRun(sub, options);
         AddJobs(sub, options);
         AddLog(sub, options);
         KeepDryRunsUnlogged(sub);
         const auto arguments = AddConversion(sub, options);
         CLI::Option* const plan = sub->add_option_function<std::string>(
             "--plan", [=](const std::string& file) { options->plan = file; },
             "Do what plan --output has written, if the source is still what it was");
         plan->type_name("FILE");
         sub->get_option("--recursive")->excludes(plan);
         for (CLI::Option* const argument : arguments) argument->excludes(plan);
         sub->parse_complete_callback([=] {
             for (const CLI::Option* const argument : arguments) {
                 if (plan->empty() && argument->empty()) {
                     throw CLI::RequiredError(argument->get_name());
                 }
             }
         });
     }},
    {Command::kPlan, "plan", "Say what convert would meet, and what it would lose; change nothing",
     [](CLI::App* sub, Options* options) {
         for (CLI::Option* const argument : AddConversion(sub, options)) argument->required();
         CLI::Option* const output = sub->add_option_function<std::string>(
             "--output", [=](const std::string& file) { options->output = file; },
             "A new file, for convert --plan");
         output->type_name("FILE");
         sub->add_flag("-f,--force", options->force, "Replace a FILE that is there")->needs(output);
     }},
    {Command::kDiff, "diff", "Compare the metadata of two objects or trees on volumes of any kinds",
     [](CLI::App* sub, Options* options) {
         AddJobs(sub, options);
         AddRecursive(sub, options);
         sub->add_flag("--data", options->data, "What is in the files, too");
         CLI::Option* const brief =
             sub->add_flag("-q,--brief", options->brief, "Only which objects differ");
         sub->add_flag("-i,--itemize-changes", options->itemized,
                       "A line as rsync's for what would make the second like the first: > data, c "
                       "target, . neither; kind; data, attributes, Finder info, resource fork, "
                       "entries such as comments and dates, marks, what services keep")
             ->excludes(brief);
         sub->add_option_function<std::string>(
                "A", [=](const std::string& path) { options->paths.arguments = {path}; },
                "The first")
             ->required();
         sub->add_option("B", options->destination, "The second")->required();
         sub->footer("Exit status: 0 equal; 1 different; 2 something could not be compared.");
     }},
    {Command::kDump, "dump", "Show and check every field of an EA stream or AppleDouble file",
     [](CLI::App* sub, Options* options) {
         CLI::Option* const record = sub->add_flag(
             "--record", options->record, "FILE is an object, whose netatalk record is shown");
         sub->add_flag("--attributes", options->attributes,
                       "FILE is an object, and what Samba, netatalk and others keep of it in its "
                       "extended attributes is shown")
             ->excludes(record);
         sub->add_option_function<std::string>(
                "FILE", [=](const std::string& path) { options->paths.arguments = {path}; },
                "A metadata file")
             ->required();
     }},
    {Command::kSalvage, "salvage",
     "Write what can still be read of an object's metadata into files of their own",
     [](CLI::App* sub, Options* options) {
         AddDryRun(sub, options);
         AddPath(sub, options, "A file or directory");
         sub->add_option("DIR", options->destination, "A new directory")->required();
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

// The first word that is no option and no value of one.
struct Word {
    std::size_t index;
    const Syntax* syntax;              // null: it is no command
    std::vector<std::string> volumes;  // options before it
    bool json = false;
};

// None when there is no such word, or another option before it.
std::optional<Word> FindCommand(std::span<const char* const> arguments) {
    constexpr std::string_view kVolume = "--volume";
    Word found = {0, nullptr, {}};
    for (std::size_t i = 0; i < arguments.size(); ++i) {
        const std::string_view word = arguments[i];
        if (word == kVolume) {
            if (++i < arguments.size()) found.volumes.emplace_back(arguments[i]);
        } else if (!word.starts_with('-')) {
            found.index = i;
            const auto* const known =
                std::find_if(std::begin(kCommands), std::end(kCommands),
                             [&](const Syntax& one) { return one.name == word; });
            if (known != std::end(kCommands)) found.syntax = known;
            return found;
        } else if (word == "--json") {
            found.json = true;
        } else if (word.starts_with("--color")) {
            continue;
        } else if (word.starts_with("--volume=")) {
            found.volumes.emplace_back(word.substr(kVolume.size() + 1));
        } else {
            return std::nullopt;
        }
    }
    return std::nullopt;
}

std::optional<Habit> HabitOf(Command command) {
    switch (command) {
        case Command::kCopy:
            return Habit::kCopy;
        case Command::kMove:
            return Habit::kMove;
        case Command::kDelete:
            return Habit::kDelete;
        default:
            return std::nullopt;
    }
}

std::variant<Options, int> ParseAs(Command command, Habit habit, std::span<const char* const> words,
                                   Word before = {}) {
    auto parsed = ParseHabit(habit, words, ExamplesOf);
    if (const int* const status = std::get_if<int>(&parsed)) return *status;
    auto& read = std::get<HabitOptions>(parsed);
    Options options;
    options.command = command;
    options.volumes = std::move(before.volumes);
    options.volumes.insert(options.volumes.end(), read.volumes.begin(), read.volumes.end());
    options.copy = std::move(read.copy);
    options.remove = std::move(read.remove);
    options.progress = std::move(read.progress);
    options.dry_run = read.dry_run;
    options.json = before.json || read.json;
    options.copy.job.json = options.remove.job.json = options.json;
    return options;
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

constexpr const char* kHelp = "help";
constexpr const char* kHelpWhat = "Show the usage, or a command's";

// Of every command.
void AddGeneral(CLI::App* app, Options* options) {
    app->add_flag("--json", options->json, "Write JSON; bytes are hexadecimal digits");
    app->add_flag(
           "--color{always}", options->color,
           "Of findings and differences: --color=auto, always or never; auto: on a terminal, "
           "unless NO_COLOR is set")
        ->check(CLI::IsMember({"auto", "always", "never"}));
    app->add_option("--volume", options->volumes,
                    "Declare a directory's volume type for this run; may be repeated")
        ->type_name("PATH=TYPE")
        ->expected(1)
        ->allow_extra_args(false)
        ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
}

void AddVersion(CLI::App* app) {
    app->set_version_flag("-V,--version", "mavoea " MAVOEA_TOOL_VERSION, "Show the version");
}

// "help COMMAND" is "COMMAND --help". `words` are those of the command line.
std::variant<Options, int> Help(const char* program, std::span<const char* const> words) {
    std::vector<const char*> line = {program};
    line.insert(line.end(), words.begin(), words.end());
    line.push_back("--help");
    return ParseCommandLine(static_cast<int>(line.size()), line.data());
}

void AddWords(const CLI::App& app, CommandWords* words) {
    for (const CLI::Option* const option : app.get_options()) {
        if (option->get_positional()) {
            words->operands.push_back(option->get_name(true));
            continue;
        }
        OptionWords one = {{}, option->get_description(), {}, OptionWords::Value::kNone};
        for (const std::string& letter : option->get_snames()) {
            one.spellings.push_back('-' + letter);
        }
        for (const std::string& name : option->get_lnames()) one.spellings.push_back("--" + name);
        if (option->get_items_expected_max() > 0) {
            one.value = option->get_type_name();
            one.takes = OptionWords::Value::kNext;
        }
        words->options.push_back(std::move(one));
    }
}

}  // namespace

std::vector<CommandWords> AllCommands() {
    std::vector<CommandWords> all;
    for (const Syntax& one : kCommands) all.push_back({one.name, one.what, {}, {}});
    all.push_back({kHelp, kHelpWhat, {}, {"COMMAND"}});
    return all;
}

CommandWords WordsOf(std::string_view command) {
    CommandWords words;
    Options options;
    CLI::App app;
    if (command.empty()) AddVersion(&app);
    for (const Syntax& one : kCommands) {
        if (one.name != command) continue;
        words.name = one.name;
        words.what = one.what;
        if (const auto habit = HabitOf(one.command)) {
            words.options = OptionsOf(*habit);
            words.operands = {*habit == Habit::kDelete ? "PATH" : "SRC"};
            return words;
        }
        one.add_arguments(&app, &options);
    }
    AddGeneral(&app, &options);
    AddWords(app, &words);
    return words;
}

std::variant<Options, int> ParseCommandLine(int argc, const char* const* argv) {
    const std::span<const char* const> arguments(argv + 1, argv + std::max(argc, 1));
    const std::string program = argc > 0 ? argv[0] : "";
    const std::string own_name = program.substr(program.rfind('/') + 1);
    for (const Syntax& one : kCommands) {
        const auto habit = HabitOf(one.command);
        if (!habit || own_name != one.name) continue;
        SpeakAs(own_name);
        return ParseAs(one.command, *habit, arguments);
    }
    if (!arguments.empty() && std::string_view(arguments.front()) == "--complete") {
        return Complete(arguments.subspan(1));
    }
    const auto word = FindCommand(arguments);
    if (word && std::string_view(arguments[word->index]) == kHelp) {
        return Help(argv[0], arguments.subspan(word->index + 1));
    }
    if (word) {
        if (word->syntax == nullptr) throw NoCommand(arguments[word->index]);
        const Command command = word->syntax->command;
        const auto behind = arguments.subspan(word->index + 1);
        if (const auto habit = HabitOf(command)) return ParseAs(command, *habit, behind, *word);
    }

    Options options;
    CLI::App app(
        "Shows and changes the Mac and SMB metadata of files: named attributes, resource "
        "forks, Finder info.",
        "mavoea");
    app.require_subcommand(1);
    app.fallthrough();
    AddVersion(&app);
    AddGeneral(&app, &options);

    // Commands and their arguments take longer to set up than many a command to run: there is only
    // the one that is named, or may be.
    for (const Syntax& syntax : kCommands) {
        if (word && word->syntax != &syntax) continue;
        CLI::App* const sub = app.add_subcommand(syntax.name, syntax.what);
        sub->callback([&options, &syntax] { options.command = syntax.command; });
        const std::string_view name = syntax.name;
        if (std::find(arguments.begin(), arguments.end(), name) != arguments.end()) {
            syntax.add_arguments(sub, &options);
            // Before what else there is to say, and looked for when somebody asks.
            const bool last = sub->get_footer().empty();
            sub->footer([name, last] { return ExamplesOf(name) + (last ? "" : "\n"); });
        }
    }
    if (!word) app.add_subcommand(kHelp, kHelpWhat);

    app.footer(kExamples);
    try {
        std::vector<std::string> last_first;
        for (int i = argc - 1; i > 0; --i) last_first.push_back(Guarded(argv[i]));
        app.parse(std::move(last_first));
        if (options.command == Command::kImport) PlaceImport(&options);
    } catch (const CLI::Success& success) {
        return app.exit(success);
    } catch (const CLI::ParseError& error) {
        std::cerr << "mavoea: " << error.what() << "; mavoea --help has the usage\n";
        return static_cast<int>(kFailed);
    }
    for (std::string& path : options.paths.arguments) path = Unguarded(std::move(path));
    for (std::string& volume : options.volumes) volume = Unguarded(std::move(volume));
    options.name = Unguarded(std::move(options.name));
    options.archive = Unguarded(std::move(options.archive));
    options.destination = Unguarded(std::move(options.destination));
    options.to = Unguarded(std::move(options.to));
    for (std::optional<std::string>* const text : options.info.Texts()) {
        if (*text) *text = Unguarded(**text);
    }
    for (std::string& tag : options.info.added_tags) tag = Unguarded(std::move(tag));
    for (std::string& tag : options.info.removed_tags) tag = Unguarded(std::move(tag));
    options.directory = Unguarded(std::move(options.directory));
    if (options.output) options.output = Unguarded(*std::move(options.output));
    if (options.value) options.value = Unguarded(*std::move(options.value));
    if (options.file) options.file = Unguarded(*std::move(options.file));
    return options;
}

}  // namespace mavoea::tool

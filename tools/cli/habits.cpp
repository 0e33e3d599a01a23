#include "tools/cli/habits.h"

#include <getopt.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <optional>
#include <string_view>

#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/say/output.h"

namespace mavoea::tool {
namespace {

constexpr unsigned kCp = 1;
constexpr unsigned kMv = 2;
constexpr unsigned kRm = 4;

unsigned MaskOf(Habit habit) {
    switch (habit) {
        case Habit::kCopy:
            return kCp;
        case Habit::kMove:
            return kMv;
        case Habit::kDelete:
            break;
    }
    return kRm;
}

// What getopt_long() returns for options without a letter.
enum Long : int {
    kAttributesOnly = 256,
    kBackup,
    kCopyContents,
    kPreserve,
    kNoPreserve,
    kParents,
    kReflink,
    kRemoveDestination,
    kSparse,
    kStripSlashes,
    kContext,
    kAtomic,
    kAllowLoss,
    kDryRun,
    kInteractive,
    kOneFileSystem,
    kPreserveRoot,
    kNoPreserveRoot,
    kPresumeTty,
    kFiles0From,
    kProgress,
    kVolume,
    kJson,
    kHelp,
    kVersion
};

struct Syntax {
    unsigned commands;
    int letter;         // or one of the above
    const char* name;   // null: the letter only
    int argument;       // no_argument, ...
    const char* value;  // what it is called
    const char* what;   // null: another spelling of the one before
};

constexpr Syntax kSyntax[] = {
    {kCp, 'a', "archive", no_argument, nullptr, "As -dR --preserve=all"},
    {kCp, kAttributesOnly, "attributes-only", no_argument, nullptr,
     "Copy no data, only attributes and metadata"},
    {kCp | kMv, kBackup, "backup", optional_argument, "CONTROL",
     "Keep what would be overwritten: none, simple, existing (numbered where there are such) or "
     "numbered"},
    {kCp | kMv, 'b', nullptr, no_argument, nullptr, "As --backup, without a CONTROL"},
    {kCp, kCopyContents, "copy-contents", no_argument, nullptr,
     "With -r, read special files in place of making them anew"},
    {kCp, 'd', nullptr, no_argument, nullptr, "As --no-dereference --preserve=links"},
    {kCp, 'f', "force", no_argument, nullptr, "Remove what cannot be opened, and try again"},
    {kMv, 'f', "force", no_argument, nullptr, "Do not ask"},
    {kRm, 'f', "force", no_argument, nullptr, "Do not ask, and leave alone what is not there"},
    {kCp | kMv, 'i', "interactive", no_argument, nullptr, "Ask before anything is overwritten"},
    {kRm, 'i', nullptr, no_argument, nullptr, "Ask before each removal"},
    {kRm, 'I', nullptr, no_argument, nullptr,
     "Ask once before more than three objects, or a tree, are removed"},
    {kRm, kInteractive, "interactive", optional_argument, "WHEN",
     "never, once (-I) or always (-i)"},
    {kCp, 'H', nullptr, no_argument, nullptr, "Follow symbolic links that are named"},
    {kCp, 'l', "link", no_argument, nullptr, "Make hard links in place of copies"},
    {kCp, 'L', "dereference", no_argument, nullptr, "Follow all symbolic links"},
    {kCp | kMv, 'n', "no-clobber", no_argument, nullptr, "Leave alone what is there"},
    {kCp, 'P', "no-dereference", no_argument, nullptr, "Follow no symbolic links"},
    {kCp, 'p', nullptr, no_argument, nullptr, "As --preserve=mode,ownership,timestamps"},
    {kCp, kPreserve, "preserve", optional_argument, "LIST",
     "Keep mode, ownership and timestamps, or what is listed: those, links, xattr, all"},
    {kCp, kNoPreserve, "no-preserve", required_argument, "LIST", "Do not keep what is listed"},
    {kCp, kParents, "parents", no_argument, nullptr, "Use the whole path of a source below DST"},
    {kCp, 'r', "recursive", no_argument, nullptr, "With all that is below directories"},
    {kCp, 'R', nullptr, no_argument, nullptr, nullptr},
    {kCp, kReflink, "reflink", optional_argument, "WHEN",
     "Share blocks with the source: always, auto or never"},
    {kCp, kRemoveDestination, "remove-destination", no_argument, nullptr,
     "Replace what is there, and never write to it"},
    {kCp, kSparse, "sparse", required_argument, "WHEN", "Make holes: auto, always or never"},
    {kCp | kMv, kStripSlashes, "strip-trailing-slashes", no_argument, nullptr,
     "Leave out slashes at the end of sources"},
    {kCp, 's', "symbolic-link", no_argument, nullptr, "Make symbolic links in place of copies"},
    {kCp | kMv, 'S', "suffix", required_argument, "SUFFIX", "Of simple backups, \"~\" otherwise"},
    {kCp | kMv, 't', "target-directory", required_argument, "DIR",
     "The directory to put all of them into"},
    {kCp | kMv, 'T', "no-target-directory", no_argument, nullptr,
     "DST is the new object itself, never the directory to put it into"},
    {kCp | kMv, 'u', "update", no_argument, nullptr, "Only what is newer than what is there"},
    {kCp | kMv | kRm, 'v', "verbose", no_argument, nullptr, "Say what is done"},
    {kCp, 'x', "one-file-system", no_argument, nullptr, "Stay on the file system of each source"},
    {kCp, 'Z', nullptr, no_argument, nullptr, nullptr},
    {kCp, kContext, "context", optional_argument, nullptr, nullptr},
    {kCp, kAtomic, "atomic", no_argument, nullptr,
     "Replace what is there in one step when its copy is whole, and never write to it"},
    {kCp | kMv, kAllowLoss, "allow-loss", no_argument, nullptr,
     "What cannot be kept at the destination is named, and may be lost"},
    {kCp | kMv, kDryRun, "dry-run", no_argument, nullptr,
     "Say what would be done, as far as it is known before, ask nothing, and change nothing"},
    {kRm, 'd', "dir", no_argument, nullptr, "Empty directories, too"},
    {kRm, 'r', "recursive", no_argument, nullptr, "Directories with all that is in them"},
    {kRm, 'R', nullptr, no_argument, nullptr, nullptr},
    {kRm, 'n', "dry-run", no_argument, nullptr,
     "Say that, as far as it is known before, ask nothing, and change nothing"},
    {kRm, kOneFileSystem, "one-file-system", no_argument, nullptr,
     "Leave out directories on other file systems than what was named"},
    {kRm, kPreserveRoot, "preserve-root", optional_argument, "all",
     "Do not remove '/'; with \"all\" nothing that is on another file system than its parent"},
    {kRm, kNoPreserveRoot, "no-preserve-root", no_argument, nullptr, "Remove '/' like any other"},
    {kRm, kPresumeTty, "-presume-input-tty", no_argument, nullptr, nullptr},
    {kCp | kMv, kFiles0From, "files0-from", required_argument, "FILE",
     "Take each SRC from a file that has a NUL behind each; \"-\": standard input"},
    {kRm, kFiles0From, "files0-from", required_argument, "FILE",
     "Take each PATH from a file that has a NUL behind each; \"-\": standard input"},
    {kCp | kMv | kRm, kProgress, "progress", optional_argument, "SECONDS",
     "Tell how far it is each 30 s, or so many, where no terminal shows it; SIGUSR1 asks for it"},
    {kCp | kMv | kRm, kVolume, "volume", required_argument, "PATH=TYPE",
     "Declare a directory's volume type for this run; may be repeated"},
    {kCp | kMv | kRm, kJson, "json", no_argument, nullptr, "Write JSON"},
    {kCp | kMv | kRm, kHelp, "help", no_argument, nullptr, "Show this"},
    {kCp | kMv | kRm, kVersion, "version", no_argument, nullptr, "Show the version"},
};

const char* NameOf(Habit habit) {
    switch (habit) {
        case Habit::kCopy:
            return "cp";
        case Habit::kMove:
            return "mv";
        case Habit::kDelete:
            break;
    }
    return "rm";
}

std::string Program(Habit habit) {
    return SpeaksAsAnother() ? Speaker() : Speaker() + ' ' + NameOf(habit);
}

// ---- What is wrong with a command line ----------------------------------------------------------

// Thrown when it has been said.
struct Misused {};

[[noreturn]] void Misuse(Habit habit, const std::string& what) {
    if (!what.empty()) Report(what);
    std::cerr << "Try '" << Program(habit) << " --help' for more information.\n";
    throw Misused();
}

[[noreturn]] void BadArgument(Habit habit, const std::string& value, const std::string& option,
                              const std::vector<std::string>& valid) {
    std::string what =
        "invalid argument " + Quoted(value) + " for " + Quoted(option) + "\nValid arguments are:";
    for (const std::string& one : valid) what += "\n  - " + one;
    Misuse(habit, what);
}

// The index of the word that `value` is, or begins.
std::size_t Choice(Habit habit, const std::string& value, const std::string& option,
                   const std::vector<std::string>& words) {
    std::optional<std::size_t> found;
    for (std::size_t i = 0; i < words.size(); ++i) {
        if (words[i] == value) return i;
        if (!words[i].starts_with(value)) continue;
        if (found) BadArgument(habit, value, option, words);
        found = i;
    }
    if (!found) BadArgument(habit, value, option, words);
    return *found;
}

// ---- One command line ---------------------------------------------------------------------------

class Line {
 public:
    explicit Line(Habit habit) : habit_(habit) {
        Manner& manner = options_.copy.manner;
        manner.umask = ::umask(0);
        (void)::umask(manner.umask);
        if (habit == Habit::kCopy) {
            manner.keeps_mode = manner.keeps_owner = manner.keeps_times = false;
            manner.keeps_attributes = false;
        } else {
            options_.copy.keeps_links = true;
        }
        if (const char* const suffix = std::getenv("SIMPLE_BACKUP_SUFFIX")) suffix_ = suffix;
    }

    void Take(int letter, const char* argument) {
        const std::string value = argument == nullptr ? "" : argument;
        const bool removes = habit_ == Habit::kDelete;
        JobOptions& job = removes ? options_.remove.job : options_.copy.job;
        switch (letter) {
            case 'r':
            case 'R':
                job.recursive = true;
                break;
            case 'v':
                job.verbose = true;
                break;
            case kFiles0From:
                job.list = value;
                break;
            case kProgress:
                options_.progress = SecondsIn(argument == nullptr ? "30" : value);
                break;
            case kVolume:
                options_.volumes.push_back(value);
                break;
            case kJson:
                options_.json = true;
                break;
            default:
                removes ? TakeForRemoval(letter, argument, value)
                        : TakeForCopy(letter, argument, value);
        }
    }

    HabitOptions Finish(std::vector<std::string> operands) {
        if (habit_ == Habit::kDelete) {
            const auto& list = options_.remove.job.list;
            if (list && !operands.empty()) MisuseWithList(operands.front());
            if (list == "-" && (options_.remove.ask == AskToRemove::kAlways ||
                                options_.remove.ask == AskToRemove::kOnce)) {
                MisuseInput();
            }
            if (operands.empty() && !list && !options_.remove.force) {
                Misuse(habit_, "missing operand");
            }
            options_.remove.job.paths = std::move(operands);
            options_.remove.job.json = options_.json;
            return std::move(options_);
        }
        CopyOptions& copy = options_.copy;
        CheckOperands(operands);
        if (backs_up_) {
            copy.backup = BackupNamed();
        }
        if (backs_up_ && copy.overwrite == Overwrite::kNever) {
            Misuse(habit_, "options --backup and --no-clobber are mutually exclusive");
        }
        if (copy.manner.reflink == Reflink::kAlways && copy.manner.sparse != Sparse::kAuto) {
            Misuse(habit_, "--reflink can be used only with --sparse=auto");
        }
        if (copy.hard_links && copy.symbolic_links) {
            Misuse(habit_, "cannot make both hard and symbolic links");
        }
        copy.suffix = suffix_.empty() || suffix_.find('/') != std::string::npos ? "~" : suffix_;
        copy.job.paths = std::move(operands);
        copy.job.json = options_.json;
        KeepNameBehindBackup();
        return std::move(options_);
    }

 private:
    [[noreturn]] void MisuseWithList(const std::string& operand) const {
        Misuse(habit_, "extra operand " + Quoted(operand) +
                           "\nfile operands cannot be combined with --files0-from");
    }

    // Nobody can answer questions where the list is.
    [[noreturn]] void MisuseInput() const {
        Misuse(habit_, "standard input cannot both have the files and answer questions");
    }

    std::string SecondsIn(const std::string& value) const {
        constexpr std::size_t kMostDigits = 5;
        const bool digits = value.find_first_not_of("0123456789") == std::string::npos;
        if (value.empty() || value.size() > kMostDigits || !digits) {
            Misuse(habit_, "invalid argument " + Quoted(value) + " for " + Quoted("--progress"));
        }
        return value;
    }

    void CheckSourcesInList(const std::vector<std::string>& operands) const {
        const CopyOptions& copy = options_.copy;
        const std::size_t most = copy.target_directory ? 0 : 1;  // the destination
        if (copy.no_target_directory) {
            Misuse(habit_, "cannot combine --files0-from and --no-target-directory (-T)");
        }
        if (operands.size() < most) Misuse(habit_, "missing destination file operand");
        if (operands.size() > most) MisuseWithList(operands[most]);
        if (copy.job.list == "-" && copy.overwrite == Overwrite::kAsk) MisuseInput();
    }

    void CheckOperands(const std::vector<std::string>& operands) const {
        const CopyOptions& copy = options_.copy;
        if (copy.no_target_directory && copy.target_directory) {
            Misuse(habit_, "cannot combine --target-directory (-t) and --no-target-directory (-T)");
        }
        if (copy.job.list) return CheckSourcesInList(operands);
        if (operands.empty()) Misuse(habit_, "missing file operand");
        if (operands.size() == 1 && !copy.target_directory) {
            Misuse(habit_, "missing destination file operand after " + Quoted(operands.front()));
        }
        if (copy.no_target_directory && operands.size() > 2) {
            Misuse(habit_, "extra operand " + Quoted(operands[2]));
        }
    }

    // A file that is forced over itself is copied to its backup.
    void KeepNameBehindBackup() {
        CopyOptions& copy = options_.copy;
        struct stat info;
        if (!copy.force || copy.backup == Backup::kNone || copy.target_directory ||
            habit_ != Habit::kCopy || copy.job.paths.size() != 2 ||
            copy.job.paths[0] != copy.job.paths[1] ||
            ::lstat(copy.job.paths[0].c_str(), &info) != 0 || !S_ISREG(info.st_mode)) {
            return;
        }
        const Place place = PlaceOf(copy.job.paths[0], Shown::kAsGiven);
        std::string& to = copy.job.paths[1];
        to.replace(to.size() - place.name.size(), place.name.size(),
                   BackupName(place, copy.backup, copy.suffix));
        copy.backup = Backup::kNone;
        copy.no_target_directory = true;
    }

    Backup BackupNamed() const {
        const char* const usual = std::getenv("VERSION_CONTROL");
        const std::string name = !backup_.empty() ? backup_ : usual != nullptr ? usual : "";
        if (name.empty()) return Backup::kExisting;
        if (const auto backup = BackupFromName(name)) return *backup;
        BadArgument(habit_, name, backup_.empty() ? "$VERSION_CONTROL" : "backup type",
                    {"none", "off", "simple", "never", "existing", "nil", "numbered", "t"});
    }

    void TakeForCopy(int letter, const char* argument, const std::string& value) {
        CopyOptions& copy = options_.copy;
        Manner& manner = copy.manner;
        switch (letter) {
            case 'a':
                copy.follow = Follow::kNever;
                copy.job.recursive = true;
                KeepAll(false);
                break;
            case kAttributesOnly:
                manner.data = false;
                break;
            case kBackup:
            case 'b':
                backs_up_ = true;
                if (argument != nullptr) backup_ = value;
                break;
            case kCopyContents:
                copy.copy_contents = true;
                break;
            case 'd':
                copy.follow = Follow::kNever;
                copy.keeps_links = true;
                break;
            case 'f':
                if (habit_ == Habit::kCopy) {
                    copy.force = true;
                } else {
                    copy.overwrite = Overwrite::kAlways;
                }
                break;
            case 'i':
                copy.overwrite = Overwrite::kAsk;
                break;
            case 'n':
                copy.overwrite = Overwrite::kNever;
                break;
            case 'H':
                copy.follow = Follow::kNamed;
                break;
            case 'l':
                copy.hard_links = true;
                break;
            case 'L':
                copy.follow = Follow::kAlways;
                break;
            case 'P':
                copy.follow = Follow::kNever;
                break;
            case 'p':
                Keep("mode,ownership,timestamps", true);
                break;
            case kPreserve:
                Keep(argument == nullptr ? "mode,ownership,timestamps" : value, true);
                break;
            case kNoPreserve:
                Keep(value, false);
                break;
            case kParents:
                copy.parents = true;
                break;
            case kReflink:
                manner.reflink = argument == nullptr
                                     ? Reflink::kAlways
                                     : kReflinks[Choice(habit_, value, "--reflink",
                                                        {"auto", "always", "never"})];
                break;
            case kRemoveDestination:
                copy.remove_destination = true;
                break;
            case kSparse:
                manner.sparse =
                    kSparses[Choice(habit_, value, "--sparse", {"auto", "always", "never"})];
                break;
            case kStripSlashes:
                copy.strip_slashes = true;
                break;
            case 's':
                copy.symbolic_links = true;
                break;
            case 'S':
                backs_up_ = true;
                suffix_ = value;
                break;
            case 't':
                if (copy.target_directory) {
                    Report("multiple target directories specified");
                    throw Misused();
                }
                copy.target_directory = value;
                break;
            case 'T':
                copy.no_target_directory = true;
                break;
            case 'u':
                copy.update = true;
                break;
            case 'x':
                copy.one_file_system = true;
                break;
            case kContext:
                if (argument != nullptr) {
                    Report("warning: ignoring --context; it requires an SELinux-enabled kernel");
                }
                break;
            case kAtomic:
                copy.atomic = true;
                break;
            case kAllowLoss:
                copy.allow_loss = true;
                break;
            case kDryRun:
                options_.dry_run = copy.job.verbose = true;
                break;
            default:
                break;
        }
    }

    static constexpr Reflink kReflinks[] = {Reflink::kAuto, Reflink::kAlways, Reflink::kNever};
    static constexpr Sparse kSparses[] = {Sparse::kAuto, Sparse::kAlways, Sparse::kNever};

    // `insists`: what cannot be kept is a failure.
    void KeepAll(bool insists) {
        Manner& manner = options_.copy.manner;
        manner.keeps_mode = manner.keeps_owner = manner.keeps_times = true;
        manner.keeps_attributes = options_.copy.keeps_links = true;
        manner.denies_mode = false;
        manner.insists = manner.insists || insists;
    }

    void Keep(const std::string& list, bool keeps) {
        Manner& manner = options_.copy.manner;
        std::size_t begin = 0;
        while (begin <= list.size()) {
            const std::size_t end = std::min(list.find(',', begin), list.size());
            const std::string word = list.substr(begin, end - begin);
            begin = end + 1;
            switch (
                Choice(habit_, word, keeps ? "--preserve" : "--no-preserve",
                       {"mode", "timestamps", "ownership", "links", "context", "xattr", "all"})) {
                case 0:
                    manner.keeps_mode = keeps;
                    manner.denies_mode = !keeps;
                    break;
                case 1:
                    manner.keeps_times = keeps;
                    break;
                case 2:
                    manner.keeps_owner = keeps;
                    break;
                case 3:
                    options_.copy.keeps_links = keeps;
                    break;
                case 4:
                    if (!keeps) break;
                    Report("cannot preserve security context without an SELinux-enabled kernel");
                    throw Misused();
                case 5:
                    manner.keeps_attributes = manner.insists = keeps;
                    break;
                default:
                    if (keeps) {
                        KeepAll(false);
                    } else {
                        manner.keeps_mode = manner.keeps_owner = manner.keeps_times = false;
                        manner.keeps_attributes = options_.copy.keeps_links = false;
                        manner.denies_mode = true;
                    }
            }
        }
    }

    void TakeForRemoval(int letter, const char* argument, const std::string& value) {
        RemoveOptions& remove = options_.remove;
        const auto ask = [&](AskToRemove when) {
            remove.ask = when;
            remove.force = false;
        };
        switch (letter) {
            case 'd':
                remove.directories = true;
                break;
            case 'n':
                options_.dry_run = remove.job.verbose = true;
                break;
            case 'f':
                remove.ask = AskToRemove::kNever;
                remove.force = true;
                break;
            case 'i':
                ask(AskToRemove::kAlways);
                break;
            case 'I':
                ask(AskToRemove::kOnce);
                break;
            case kInteractive: {
                constexpr AskToRemove kWhen[] = {AskToRemove::kNever,  AskToRemove::kNever,
                                                 AskToRemove::kNever,  AskToRemove::kOnce,
                                                 AskToRemove::kAlways, AskToRemove::kAlways};
                const AskToRemove when =
                    argument == nullptr
                        ? AskToRemove::kAlways
                        : kWhen[Choice(habit_, value, "--interactive",
                                       {"never", "no", "none", "once", "always", "yes"})];
                remove.ask = when;
                if (when != AskToRemove::kNever) remove.force = false;
                break;
            }
            case kOneFileSystem:
                remove.one_file_system = true;
                break;
            case kPreserveRoot:
                if (argument != nullptr && value != "all") {
                    Misuse(habit_, "unrecognized --preserve-root argument: " + Quoted(value));
                }
                remove.preserve_root = true;
                remove.preserve_mounts = remove.preserve_mounts || argument != nullptr;
                break;
            case kNoPreserveRoot:
                remove.preserve_root = false;
                break;
            case kPresumeTty:
                remove.presumes_terminal = true;
                break;
            default:
                break;
        }
    }

    Habit habit_;
    HabitOptions options_;
    bool backs_up_ = false;
    std::string backup_;
    std::string suffix_;
};

void PrintHelp(Habit habit, const std::string& examples) {
    constexpr std::size_t kColumn = 32;
    std::cout << "Usage: " << Program(habit)
              << (habit == Habit::kDelete ? " [OPTION]... PATH...\n"
                                          : " [OPTION]... SRC... DST\n   or: " + Program(habit) +
                                                " [OPTION]... -t DIR SRC...\n")
              << "\nOptions, all of which are those of coreutils but for the last few:\n";
    for (const Syntax& one : kSyntax) {
        if ((one.commands & MaskOf(habit)) == 0 || one.what == nullptr) continue;
        std::string text =
            one.letter < 256 ? std::string("  -") + static_cast<char>(one.letter) : "    ";
        if (one.name != nullptr) {
            text += (one.letter < 256 ? ", --" : "  --") + std::string(one.name);
            if (one.value != nullptr) {
                text += one.argument == optional_argument ? "[=" + std::string(one.value) + ']'
                                                          : '=' + std::string(one.value);
            }
        }
        text.resize(std::max(text.size() + 2, kColumn), ' ');
        std::cout << text << one.what << '\n';
    }
    if (!SpeaksAsAnother()) std::cout << '\n' << examples << '\n';
}

}  // namespace

std::vector<OptionWords> OptionsOf(Habit habit) {
    std::vector<OptionWords> options;
    for (const Syntax& one : kSyntax) {
        if ((one.commands & MaskOf(habit)) == 0) continue;
        OptionWords words = {
            {}, one.what == nullptr ? "" : one.what, {}, OptionWords::Value::kNone};
        if (one.letter < 256) words.spellings.push_back({'-', static_cast<char>(one.letter)});
        if (one.name != nullptr) words.spellings.push_back(std::string("--") + one.name);
        if (one.value != nullptr) words.value = one.value;
        if (one.argument == required_argument) words.takes = OptionWords::Value::kNext;
        if (one.argument == optional_argument) words.takes = OptionWords::Value::kBehindEquals;
        options.push_back(std::move(words));
    }
    return options;
}

std::variant<HabitOptions, int> ParseHabit(Habit habit, std::span<const char* const> words,
                                           std::string (*examples)(std::string_view command)) {
    std::string letters;
    std::vector<option> longs;
    for (const Syntax& one : kSyntax) {
        if ((one.commands & MaskOf(habit)) == 0) continue;
        if (one.letter < 256) {
            letters.push_back(static_cast<char>(one.letter));
            letters.append(static_cast<std::size_t>(one.name == nullptr ? 0 : one.argument), ':');
        }
        if (one.name != nullptr) longs.push_back({one.name, one.argument, nullptr, one.letter});
    }
    longs.push_back({});

    // getopt_long() names the program in what it says, and puts operands behind options.
    std::string program = SpeaksAsAnother() ? Speaker() : std::string("mavoea");
    std::vector<std::string> texts(words.begin(), words.end());
    std::vector<char*> arguments = {program.data()};
    for (std::string& text : texts) arguments.push_back(text.data());
    const int count = static_cast<int>(arguments.size());
    arguments.push_back(nullptr);
    ::optind = 0;
    try {
        Line line(habit);
        for (;;) {
            const int letter =
                ::getopt_long(count, arguments.data(), letters.c_str(), longs.data(), nullptr);
            if (letter < 0) break;
            switch (letter) {
                case '?':
                    Misuse(habit, {});
                case kHelp:
                    PrintHelp(habit, examples(NameOf(habit)));
                    return 0;
                case kVersion:
                    std::cout << Speaker() << " (mavoea) " MAVOEA_TOOL_VERSION "\n";
                    return 0;
                case kNoPreserveRoot: {
                    const std::string_view word = arguments[static_cast<std::size_t>(::optind - 1)];
                    if (word == "--no-preserve-root") break;
                    Report("you may not abbreviate the --no-preserve-root option");
                    return kRefused;
                }
                default:
                    break;
            }
            line.Take(letter, ::optarg);
        }
        return line.Finish({arguments.begin() + ::optind, arguments.begin() + count});
    } catch (const Misused&) {
        return kRefused;
    }
}

}  // namespace mavoea::tool

#include "tools/cli/completion.h"

#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <iostream>
#include <string>
#include <string_view>
#include <vector>

#include "tools/cli/command_line.h"
#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "tools/show/attributes.h"

namespace mavoea::tool {
namespace {

constexpr unsigned kPatience = 2;  // seconds
constexpr const char* kTypes =
    "appledouble eadir fileea xattr samba samba-stream samba-all-streams netatalk netatalk-samba "
    "linux";

// Values that are one of a few words. Of options with the same name the first counts.
constexpr struct {
    std::string_view option;
    const char* words;
} kChoices[] = {
    {"--format", "appledouble applesingle macbinary binhex"},
    {"--encoding", "text hex base64"},
    {"--label", "none grey green purple blue yellow red orange"},
    {"--backup", "none simple existing numbered"},
    {"--preserve", "mode ownership timestamps links xattr all"},
    {"--no-preserve", "mode ownership timestamps links xattr all"},
    {"--reflink", "auto always never"},
    {"--sparse", "auto always never"},
    {"--interactive", "never once always"},
    {"--preserve-root", "all"},
};

// What a command line has before the word that is completed.
struct Before {
    std::string command;                  // empty: none yet
    CommandWords syntax;                  // of the command; or without one
    std::vector<std::string> operands;    // of the command
    const OptionWords* option = nullptr;  // whose value comes next
    bool only_operands = false;           // behind "--"
    bool escaped = false;
};

class Completion {
 public:
    explicit Completion(std::string current) : current_(std::move(current)) {}

    void Run(std::span<const char* const> words) {
        before_.syntax = WordsOf({});
        for (const char* const word : words) Take(word);
        if (before_.option != nullptr) return AddValues(*before_.option, {});
        if (current_.starts_with('-') && !before_.only_operands) return AddOptions();
        if (before_.command.empty() || before_.command == "help") return AddCommands();
        AddOperands();
    }

    void Print() const {
        std::cout << rest_ << '\n';
        for (const std::string& line : lines_) std::cout << line << '\n';
        std::cout.flush();
    }

 private:
    // As it is parsed, near enough.
    void Take(const std::string& word) {
        if (before_.option != nullptr) {
            if (IsVolume(*before_.option)) Declare(word);
            before_.option = nullptr;
        } else if (word == "--" && !before_.command.empty()) {
            before_.only_operands = true;
        } else if (word.starts_with('-') && word.size() > 1 && !before_.only_operands) {
            TakeOption(word);
        } else if (before_.command.empty()) {
            before_.command = word;
            before_.syntax = WordsOf(word);
        } else {
            before_.operands.push_back(word);
        }
    }

    void TakeOption(const std::string& word) {
        const std::size_t equals = word.find('=');
        const std::string name = word.substr(0, equals);
        if (name == "--escaped") before_.escaped = true;
        const OptionWords* const option = Find(name);
        if (option == nullptr || option->takes != OptionWords::Value::kNext) return;
        if (equals == std::string::npos) {
            before_.option = option;
        } else if (IsVolume(*option)) {
            Declare(word.substr(equals + 1));
        }
    }

    const OptionWords* Find(std::string_view name) const {
        for (const OptionWords& option : before_.syntax.options) {
            for (const std::string& spelling : option.spellings) {
                if (spelling == name) return &option;
            }
        }
        return nullptr;
    }

    static bool IsVolume(const OptionWords& option) { return option.value == "PATH=TYPE"; }

    static void Declare(const std::string& volume) {
        try {
            DeclareVolume(volume);
        } catch (const Failure&) {
            // The command itself will say so.
        }
    }

    void Add(const std::string& word, const std::string& what = {}) {
        if (!word.starts_with(current_)) return;
        lines_.push_back(what.empty() ? word : word + '\t' + what);
    }

    void AddCommands() {
        if (before_.command == "help" && !before_.operands.empty()) return;
        for (const CommandWords& one : AllCommands()) {
            if (one.name != before_.command) Add(one.name, FirstPart(one.what));
        }
    }

    // What is said at length in the help.
    static std::string FirstPart(const std::string& what) { return what.substr(0, what.find(';')); }

    void AddOptions() {
        const std::size_t equals = current_.find('=');
        if (equals != std::string::npos) {
            const OptionWords* const option = Find(current_.substr(0, equals));
            if (option != nullptr && option->takes != OptionWords::Value::kNone) {
                AddValues(*option, current_.substr(0, equals + 1));
            }
            return;
        }
        for (const OptionWords& option : before_.syntax.options) {
            if (option.what.empty()) continue;
            for (const std::string& spelling : option.spellings) {
                Add(spelling, FirstPart(option.what));
            }
        }
    }

    // `begun`: "--option=" where the value is behind it.
    void AddValues(const OptionWords& option, const std::string& begun) {
        if (IsVolume(option)) {
            const std::size_t equals = current_.find('=', begun.size());
            if (equals == std::string::npos) {
                rest_ = "directories";
            } else {
                AddWords(kTypes, current_.substr(0, equals + 1));
            }
        } else if (option.value == "FILE") {
            rest_ = "files";
        } else if (option.value == "DIR") {
            rest_ = "directories";
        } else if (option.value == "TYPE") {
            AddWords(kTypes, begun);
        }
        for (const auto& [name, words] : kChoices) {
            if (Find(name) == &option) AddWords(words, begun);
        }
    }

    void AddWords(std::string_view words, const std::string& begun) {
        while (!words.empty()) {
            const std::size_t end = std::min(words.find(' '), words.size());
            Add(begun + std::string(words.substr(0, end)));
            words.remove_prefix(std::min(end + 1, words.size()));
        }
    }

    void AddOperands() {
        const std::vector<std::string>& operands = before_.syntax.operands;
        if (operands.empty()) return;
        const std::string& operand =
            operands[std::min(before_.operands.size(), operands.size() - 1)];
        if (operand == "NAME") {
            AddAttributes();
        } else if (operand == "DIR") {
            rest_ = "directories";
        } else if (operand != "VALUE") {
            rest_ = "files";
        }
    }

    void AddAttributes() {
        // The object stands before the name.
        std::vector<std::string> names;
        try {
            RequireVolumeTable();
            names = AttributeNames(before_.operands.front());
        } catch (const Failure&) {
            // The command itself will say so.
        }
        if (before_.command == "set") {
            for (const char* known :
                 {"com.apple.FinderInfo", "com.apple.ResourceFork", "mavoea.locked"}) {
                if (std::find(names.begin(), names.end(), known) == names.end()) {
                    names.emplace_back(known);
                }
            }
        }
        for (const std::string& name : names) {
            const std::string shown = Printable(name);
            // A name that is shown otherwise is taken so with --escaped only.
            if ((before_.escaped || shown == name) && IsShownByTerminals(shown)) Add(shown);
        }
    }

    Before before_;
    std::string current_;
    std::string rest_ = "words";
    std::vector<std::string> lines_;
};

}  // namespace

int Complete(std::span<const char* const> words) {
    // A server that does not answer must not keep somebody from typing.
    (void)std::signal(SIGALRM, [](int) { ::_exit(0); });
    ::alarm(kPatience);
    Completion completion(words.empty() ? "" : words.back());
    try {
        completion.Run(words.empty() ? words : words.first(words.size() - 1));
    } catch (const Failure&) {
        return 0;
    }
    completion.Print();
    return 0;
}

}  // namespace mavoea::tool

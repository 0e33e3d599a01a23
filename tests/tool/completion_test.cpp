// What shells make of a word when Tab is pressed: each script asks the tool, which only looks. bash
// and zsh run on a terminal, where somebody types; fish says what it would offer.

#include <poll.h>
#include <pty.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <chrono>
#include <filesystem>
#include <sstream>

#include "tests/support/process.h"
#include "tests/support/snapshot.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::Not;

Arguments LinesIn(const std::string& text) {
    std::istringstream in(text);
    Arguments lines;
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

std::string TextOf(const std::string& path) {
    const Bytes bytes = ReadFile(path);
    return {bytes.begin(), bytes.end()};
}

const char* const kAwkward = "with space: \"$(touch ran)\" & 'all'";

class CompletionTest : public ::testing::Test {
 protected:
    CompletionTest() {
        fs::create_directory(dir_ / "bin");
        const std::string tool = dir_ / "bin/mavoea";
        WriteFile(tool, Ascii("#!/bin/sh\nexec " + Tested().Command() + " \"$@\"\n"));
        chmod(tool.c_str(), 0755);
        fs::create_directory(volume());
        WriteFile(volume() + "/letter one.txt", Ascii("data"));
        for (const char* name : {"com.example.colour", "a:b:colon", kAwkward, "esc\x1B[31mape"}) {
            const std::string object = volume() + "/letter one.txt";
            EXPECT_THAT(RunTool({Declaration(), "set", object, name, "1"}), Succeeded());
        }
    }

    std::string volume() const { return dir_ / "volume"; }
    std::string Declaration() const { return "--volume=" + volume() + "=appledouble"; }

    // The words and what else may stand there, without what they are.
    Arguments Ask(Arguments words) const {
        words.insert(words.begin(), "--complete");
        const ToolResult result = RunTool(words);
        EXPECT_THAT(result, Succeeded());
        Arguments lines = LinesIn(result.out);
        for (std::string& line : lines) line.resize(std::min(line.find('\t'), line.size()));
        return lines;
    }

    // The words that "mavoea" is called with when somebody types `line` in the volume. In the shell
    // it is a function that writes them down.
    Arguments Typed(const std::string& shell, const std::string& line) const {
        const std::string called = dir_ / "called";
        fs::remove(called);
        const std::string function = "mavoea() {\n  if [ \"$1\" = --complete ]; then\n" +
                                     std::string("    command mavoea \"$@\"\n  else\n") +
                                     "    printf '%s\\n' \"$@\" > " + Quoted(called) +
                                     "\n  fi\n}\nPS1='ready> '\n";
        const bool bash = shell == "bash";
        const std::string setup =
            bash ? ". /usr/share/bash-completion/bash_completion\n. " MAVOEA_COMPLETIONS
                   "/mavoea.bash\nbind 'set enable-bracketed-paste off'\n"
                 : "fpath=(" MAVOEA_COMPLETIONS
                   " $fpath)\nautoload -Uz compinit\ncompinit -u -D\n"
                   "unset zle_bracketed_paste\n";
        WriteFile(dir_ / ".zshrc", Ascii(setup + function));
        const std::string rc = dir_ / ".zshrc";
        const std::string command = "cd " + Quoted(volume()) + " && PATH=" + Quoted(dir_ / "bin") +
                                    ":$PATH ZDOTDIR=" + Quoted(dir_.path()) +
                                    " HOME=" + Quoted(dir_.path()) + " TERM=dumb exec " +
                                    (bash ? "bash --noprofile --rcfile " + Quoted(rc) : "zsh -d") +
                                    " -i";

        int terminal = -1;
        const pid_t child = forkpty(&terminal, nullptr, nullptr, nullptr);
        if (child == 0) {
            execl("/bin/sh", "sh", "-c", command.c_str(), nullptr);
            _exit(127);
        }
        std::string seen;
        EXPECT_TRUE(Wait(terminal, "ready> ", &seen)) << seen;
        Type(terminal, line + "\n");
        EXPECT_TRUE(Wait(terminal, "ready> ", &seen)) << seen;
        Type(terminal, "exit\n");
        (void)Wait(terminal, "never said", &seen);  // until it has gone
        int status = 0;
        waitpid(child, &status, 0);
        close(terminal);
        return Exists(called) ? LinesIn(TextOf(called)) : Arguments{};
    }

    TempDir dir_;

 private:
    static void Type(int terminal, const std::string& text) {
        EXPECT_EQ(static_cast<ssize_t>(text.size()), write(terminal, text.data(), text.size()));
    }

    // Takes off `seen` what comes before `text`, and that. False when the shell has gone, or says
    // nothing for long.
    static bool Wait(int terminal, const std::string& text, std::string* seen) {
        for (;;) {
            const std::size_t at = seen->find(text);
            if (at != std::string::npos) {
                seen->erase(0, at + text.size());
                return true;
            }
            constexpr int kLong = 60000;  // milliseconds
            pollfd ready = {terminal, POLLIN, 0};
            if (poll(&ready, 1, kLong) <= 0) return false;
            char bytes[4096];
            const ssize_t got = read(terminal, bytes, sizeof bytes);
            if (got <= 0) return false;
            seen->append(bytes, static_cast<std::size_t>(got));
        }
    }
};

TEST_F(CompletionTest, CommandsOptionsAndValuesAreThoseOfTheCommandLine) {
    EXPECT_THAT(Ask({"sa"}), ElementsAre("words", "save", "salvage"));
    EXPECT_THAT(Ask({"help", "sa"}), ElementsAre("words", "save", "salvage"));
    EXPECT_THAT(Ask({"help", "save", ""}), ElementsAre("words"));
    EXPECT_THAT(Ask({"--v"}), ElementsAre("words", "--version", "--volume"));
    EXPECT_THAT(Ask({"list", "--v"}), ElementsAre("words", "--values", "--volume"));
    EXPECT_THAT(Ask({"cp", "--pa"}), ElementsAre("words", "--parents"));
    EXPECT_THAT(Ask({"mv", "--pa"}), ElementsAre("words"));
    EXPECT_THAT(Ask({"list", "--", "--v"}), ElementsAre("files"));
    EXPECT_THAT(Ask({"convert", "--to", "samba-"}),
                ElementsAre("words", "samba-stream", "samba-all-streams"));
    EXPECT_THAT(Ask({"convert", "--to=linu"}), ElementsAre("words", "--to=linux"));
    EXPECT_THAT(Ask({"--volume", "/srv=ea"}), ElementsAre("words", "/srv=eadir"));
    EXPECT_THAT(Ask({"--volume", "/sr"}), ElementsAre("directories"));
    EXPECT_THAT(Ask({"cp", "--sparse=al"}), ElementsAre("words", "--sparse=always"));
    EXPECT_THAT(Ask({"mv", "-t", ""}), ElementsAre("directories"));
    EXPECT_THAT(Ask({"clean", ""}), ElementsAre("directories"));
    EXPECT_THAT(Ask({"bogus", ""}), ElementsAre("words"));
    EXPECT_THAT(Ask({}), Contains("convert"));
}

TEST_F(CompletionTest, EveryTypeAndFormatThatIsOfferedIsOne) {
    for (const std::string& type : Ask({"convert", "--to", ""})) {
        if (type == "words") continue;
        EXPECT_EQ(
            0, RunTool({"--volume", volume() + "=" + type, "where", volume() + "/letter one.txt"})
                   .status)
            << type;
    }
    for (const std::string& format : Ask({"export", "--format", ""})) {
        if (format == "words") continue;
        EXPECT_NE(2, RunTool({Declaration(), "export", "--format", format,
                              volume() + "/letter one.txt", dir_ / format})
                             .status &
                         ~2)
            << format;
        EXPECT_TRUE(Exists(dir_ / format)) << format;
    }
}

TEST_F(CompletionTest, AttributesOfTheObjectAreOfferedAndNothingThatATerminalWouldTakeForMore) {
    const std::string object = volume() + "/letter one.txt";
    EXPECT_THAT(Ask({Declaration(), "get", object, ""}),
                ElementsAre("words", "com.example.colour", "a:b:colon", kAwkward));
    EXPECT_THAT(Ask({Declaration(), "remove", "--escaped", object, "esc"}),
                ElementsAre("words", "esc\\x1B[31mape"));
    EXPECT_THAT(Ask({Declaration(), "set", object, "com."}),
                ElementsAre("words", "com.example.colour", "com.apple.FinderInfo",
                            "com.apple.ResourceFork"));
    EXPECT_THAT(Ask({Declaration(), "set", object, "a", ""}), ElementsAre("words"));
    EXPECT_THAT(Ask({Declaration(), "get", volume() + "/none", ""}), ElementsAre("words"));
}

TEST_F(CompletionTest, ItOnlyLooksAndWaitsForNobody) {
    ASSERT_EQ(0, mkfifo((volume() + "/fifo").c_str(), 0600));
    WriteFile(volume() + "/other", {});
    ASSERT_EQ(0, mkfifo((volume() + "/._other").c_str(), 0600));
    const auto before = TakeSnapshot(volume());
    for (const char* name : {"/letter one.txt", "/fifo", "/other"}) {
        for (const char* command : {"get", "set", "remove"}) {
            Ask({Declaration(), command, volume() + name, ""});
        }
    }
    EXPECT_EQ(before, TakeSnapshot(volume()));
}

// Each shell makes the same words of what is typed.
class ShellTest : public CompletionTest, public ::testing::WithParamInterface<const char*> {};
INSTANTIATE_TEST_SUITE_P(Shells, ShellTest, ::testing::Values("bash", "zsh"),
                         [](const auto& of) { return std::string(of.param); });

TEST_P(ShellTest, MakesWholeWordsOfWhatIsTyped) {
    const std::string shell = GetParam();
    if (!Exists("/usr/bin/" + shell) && !Exists("/bin/" + shell)) {
        GTEST_SKIP() << "there is no " << shell;
    }
    if (shell == "bash" && !Exists("/usr/share/bash-completion/bash_completion")) {
        GTEST_SKIP() << "there is no bash-completion";
    }
    const std::string declared = "mavoea " + Declaration() + ' ';
    const std::string object = "letter one.txt";
    EXPECT_THAT(Typed(shell, "mavoea conv\t"), ElementsAre("convert"));
    EXPECT_THAT(Typed(shell, "mavoea list --val\t"), ElementsAre("list", "--values"));
    EXPECT_THAT(Typed(shell, "mavoea get let\t"), ElementsAre("get", object));
    EXPECT_THAT(Typed(shell, "mavoea set x y --file=let\t"),
                ElementsAre("set", "x", "y", "--file=" + object));
    EXPECT_THAT(Typed(shell, "mavoea convert --to samba-a\t"),
                ElementsAre("convert", "--to", "samba-all-streams"));
    EXPECT_THAT(Typed(shell, "mavoea export --format=mac\t"),
                ElementsAre("export", "--format=macbinary"));
    EXPECT_THAT(Typed(shell, "mavoea --volume /srv=apple\t"),
                ElementsAre("--volume", "/srv=appledouble"));
    EXPECT_THAT(Typed(shell, declared + "get 'letter one.txt' com.ex\t"),
                ElementsAre(Declaration(), "get", object, "com.example.colour"));
    EXPECT_THAT(Typed(shell, declared + "get letter\\ one.txt a:b:c\t"),
                ElementsAre(Declaration(), "get", object, "a:b:colon"));
    EXPECT_THAT(Typed(shell, declared + "get \"letter one.txt\" with\t"),
                ElementsAre(Declaration(), "get", object, kAwkward));
    EXPECT_THAT(Typed(shell, declared + "get --escaped let\t esc\t"),
                ElementsAre(Declaration(), "get", "--escaped", object, "esc\\x1B[31mape"));
    // What stands on the line is not run. ^U takes it away.
    for (const char* word : {"'$(touch ran)'", "\"$(touch ran)\"", "$(touch ran)", "`touch ran`"}) {
        Typed(shell, std::string("mavoea get ") + word + " x\t\x15");
    }
    // With others zsh does: its Tab expands the word that it is pressed in.
    Typed(shell, "mavoea get '$(touch ran)'\t\x15");
    EXPECT_FALSE(Exists(volume() + "/ran"));
}

TEST_F(CompletionTest, FishOffersTheSame) {
    if (!Exists("/usr/bin/fish")) GTEST_SKIP() << "there is no fish";
    const auto offered = [&](const std::string& line) {
        const std::string out = dir_ / "offered";
        const std::string command = "cd " + Quoted(volume()) + " && HOME=" + Quoted(dir_.path()) +
                                    " PATH=" + Quoted(dir_ / "bin") +
                                    ":$PATH fish --no-config -c 'source " MAVOEA_COMPLETIONS
                                    "/mavoea.fish; complete -C $argv[1]' " +
                                    Quoted(line) + " > " + Quoted(out) + " 2>&1";
        EXPECT_EQ(0, std::system(command.c_str()));
        Arguments lines = LinesIn(TextOf(out));
        for (std::string& one : lines) one.resize(std::min(one.find('\t'), one.size()));
        return lines;
    };
    const std::string declared = "mavoea " + Declaration() + ' ';
    EXPECT_THAT(offered("mavoea sal"), ElementsAre("salvage"));
    EXPECT_THAT(offered("mavoea list --val"), ElementsAre("--values"));
    EXPECT_THAT(offered("mavoea get let"), ElementsAre("letter one.txt"));
    EXPECT_THAT(offered("mavoea convert --to samba-a"), ElementsAre("samba-all-streams"));
    EXPECT_THAT(offered(declared + "get 'letter one.txt' com.ex"),
                ElementsAre("com.example.colour"));
    EXPECT_THAT(offered(declared + "get letter\\ one.txt "),
                AllOf(Contains(kAwkward), Contains("a:b:colon"), Not(Contains("letter one.txt"))));
    offered("mavoea get \"(touch ran)\" (touch ran) x");
    EXPECT_FALSE(Exists(volume() + "/ran"));
}

}  // namespace
}  // namespace mavoea::test

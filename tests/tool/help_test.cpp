// The help of the tool and of each command: the same by each way of asking, with examples that do
// what they say.

#include <filesystem>
#include <regex>
#include <sstream>

#include "tests/support/process.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::HasSubstr;
using ::testing::Not;

Arguments Commands() {
    Arguments commands;
    std::istringstream lines(RunTool({"--complete", ""}).out);
    std::string line;
    std::getline(lines, line);
    while (std::getline(lines, line)) commands.push_back(line.substr(0, line.find('\t')));
    return commands;
}

// The lines below "Examples:".
Arguments ExamplesIn(const std::string& help) {
    Arguments examples;
    std::istringstream lines(help);
    bool inside = false;
    for (std::string line; std::getline(lines, line);) {
        if (inside && line.empty()) break;
        if (inside) examples.push_back(line.substr(line.find_first_not_of(' ')));
        if (line == "Examples:") inside = true;
    }
    return examples;
}

TEST(HelpTest, IsTheSameByEachWayOfAsking) {
    const std::string all = RunTool({"--help"}).out;
    EXPECT_THAT(all, HasSubstr("help"));
    EXPECT_EQ(all, RunTool({"help"}).out);
    EXPECT_EQ(all, RunTool({"-h"}).out);
    EXPECT_EQ(all, RunTool({"help", "help"}).out);
    for (const std::string& command : Commands()) {
        const ToolResult help = RunTool({"help", command});
        EXPECT_THAT(help, Succeeded());
        EXPECT_EQ(RunTool({command, "--help"}).out, help.out) << command;
    }
    EXPECT_THAT(RunTool({"help", "bogus"}),
                Failed(2, "bogus: unknown command; mavoea --help has all of them"));
}

TEST(HelpTest, EachCommandHasAnExampleOfItsOwn) {
    ASSERT_GT(Commands().size(), 20U);
    for (const std::string& command : Commands()) {
        if (command == "help") continue;
        const Arguments examples = ExamplesIn(RunTool({command, "--help"}).out);
        EXPECT_FALSE(examples.empty()) << command;
        for (const std::string& example : examples)
            EXPECT_THAT(example, HasSubstr(' ' + command + ' '));
    }
}

// The examples of a list are read in order, each on what those before it have left.
TEST(HelpTest, EachExampleDoesWhatItSays) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const TempDir dir;
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir.path());
    fs::create_directory(dir / "bin");
    WriteFile(dir / "bin/mavoea", Ascii("#!/bin/sh\nexec " + Tested().Command() + " --volume " +
                                        Quoted(dir / "srv/share=eadir") + " --volume " +
                                        Quoted(dir / "mnt/share=appledouble") + " \"$@\"\n"));
    fs::permissions(dir / "bin/mavoea", fs::perms::owner_all);
    // Absolute paths in examples begin there.
    static const std::regex kTop(" /(srv|mnt|tmp)/");
    const auto run = [&](const std::string& example) {
        const std::string line = std::regex_replace(example, kTop, ' ' + dir.path() + "/$1/");
        return RunProgram("cd " + Quoted(dir / "srv/share") + " && PATH=" + Quoted(dir / "bin") +
                          ":$PATH; { " + line + "; } 2>&1");
    };
    // What is there before each: a letter with all kinds of metadata, and what examples take it
    // from.
    const auto prepare = [&] {
        for (const char* const top : {"srv", "mnt", "tmp"}) fs::remove_all(dir / top);
        for (const char* const one : {"srv/share/letters", "mnt/restored", "mnt/share", "tmp"}) {
            fs::create_directories(dir / one);
        }
        WriteFile(dir / "srv/share/letter.txt", Ascii("Dear diary"));
        WriteFile(dir / "srv/share/letters/a.txt", Ascii("a"));
        WriteFile(dir / "srv/share/picture.psd", Ascii("8BPS"));
        WriteFile(dir / "srv/share/letter.rsrc", Ascii("fork"));
        const auto made =
            run("mavoea set letter.txt com.example.colour red && "
                "mavoea set letter.txt com.apple.ResourceFork fork && "
                "mavoea set-info letter.txt letters/a.txt --type TEXT && "
                "mavoea set letters/a.txt com.example.size 1");
        ASSERT_EQ(0, made.status) << made.output;
    };
    // What one of them needs besides, or cannot do with.
    const struct {
        const char* example;
        const char* needed;
    } needs[] = {
        {"import ._letter.txt", "mavoea export letter.txt ._letter.txt"},
        {"import letter.hqx",
         "printf data > note.txt && mavoea export --format binhex note.txt "
         "letter.hqx && rm note.txt"},
        {"import -r",
         "mkdir unpacked && cp letter.txt unpacked/ && mavoea export letter.txt "
         "unpacked/._letter.txt"},
        {"export", "mavoea remove letter.txt com.example.colour"},
        {"restore", "mavoea save -r /srv/share --output share.txt"},
        {"carry", "cp -r letters /mnt/restored/letters"},
        {"convert --plan",
         "mavoea plan -r --to samba --output share.plan letters /mnt/share/letters"},
        {"diff", "mavoea cp -a . /mnt/share"},
        {"dump --record", "mavoea set-info letter.txt --comment words"},
        {"dump --attributes", "setfattr -n user.other -v 1 letter.txt"},
    };
    for (const std::string& example : ExamplesIn(RunTool({"--help"}).out)) {
        SCOPED_TRACE(example);
        prepare();
        for (const auto& [some, needed] : needs) {
            if (example.find(std::string("mavoea ") + some) == std::string::npos) continue;
            const auto made = run(needed);
            ASSERT_EQ(0, made.status) << made.output;
        }
        const auto result = run(example);
        EXPECT_EQ(0, result.status) << result.output;
        EXPECT_THAT(result.output, Not(HasSubstr("has the usage")));
    }
}

TEST(HelpTest, TheVersionIsAskedForByALetterToo) {
    EXPECT_THAT(RunTool({"-V"}), Succeeded());
    EXPECT_EQ(RunTool({"--version"}).out, RunTool({"-V"}).out);
}

}  // namespace
}  // namespace mavoea::test

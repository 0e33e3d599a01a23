// The manual: pages that can be read and found, and that have each option of their command.

#include <filesystem>
#include <regex>
#include <set>
#include <sstream>

#include "tests/support/process.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::AnyOf;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

// Those of this build; no directory where it has none.
const std::string kPages = MAVOEA_MANUAL_PAGES;

class ManualTest : public ::testing::Test {
 protected:
    void SetUp() override {
        if (kPages.empty()) GTEST_SKIP() << "this build has no manual: MAVOEA_MANUAL is off";
        if (!HasProgram("man")) GTEST_SKIP() << "there is no man";
    }

    // "mavoea.1", "mavoea-list.1", ...
    static std::vector<std::string> Pages() {
        std::vector<std::string> pages;
        for (const std::string& name : NamesIn(kPages)) {
            if (std::regex_match(name, std::regex(".*\\.[0-9]"))) pages.push_back(name);
        }
        return pages;
    }

    static std::string Source(const std::string& page) {
        const Bytes bytes = ReadFile(kPages + '/' + page);
        return {bytes.begin(), bytes.end()};
    }

    // As it is read, a paragraph a line.
    static std::string Text(const std::string& page) {
        return RunProgram(
                   "MANWIDTH=1000 MANROFFOPT=-c MAN_KEEP_FORMATTING= LC_ALL=C.UTF-8 man -l " +
                   Quoted(kPages + '/' + page) + " 2>/dev/null | col -bx")
            .output;
    }

    static std::vector<std::string> Commands() {
        std::vector<std::string> commands;
        std::istringstream lines(RunTool({"--complete", ""}).out);
        std::string line;
        std::getline(lines, line);
        while (std::getline(lines, line)) {
            const std::string command = line.substr(0, line.find('\t'));
            if (command != "help") commands.push_back(command);
        }
        return commands;
    }
};

// "--name" and "-x" in the lines that begin with an option.
std::set<std::string> OptionsIn(const std::string& text) {
    static const std::regex kBegin("^ *-.*");
    static const std::regex kOption("(^|[ ,\\[])(--[a-z0][a-z0-9-]*|-[A-Za-z0-9](?=[ ,]|$))");
    std::set<std::string> options;
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);) {
        if (!std::regex_match(line, kBegin)) continue;
        // What it does stands behind it.
        line = line.substr(line.find('-'));
        line = line.substr(0, line.find("  ", line.rfind("  -", 8) == 0 ? 3 : 1));
        for (std::sregex_iterator at(line.begin(), line.end(), kOption), end; at != end; ++at) {
            options.insert((*at)[2]);
        }
    }
    return options;
}

std::string Section(const std::string& text, const std::string& title) {
    const std::size_t begin = text.find("\n" + title + "\n");
    if (begin == std::string::npos) return {};
    const std::size_t behind = begin + title.size() + 2;
    std::size_t end = behind;
    while (end < text.size() && (text[end] == ' ' || text[end] == '\n')) {
        end = std::min(text.find('\n', end), text.size());
        if (end < text.size()) ++end;
    }
    return text.substr(behind, end - behind);
}

TEST_F(ManualTest, EachCommandHasAPage) {
    for (const std::string& command : Commands()) {
        EXPECT_TRUE(Exists(kPages + "/mavoea-" + command + ".1")) << command;
    }
    for (const char* page : {"mavoea.1", "mavoea-volumes.5", "mavoea-formats.5"}) {
        EXPECT_TRUE(Exists(kPages + '/' + page)) << page;
    }
}

TEST_F(ManualTest, APageOfACommandHasAllOfItsOptionsAndNoOther) {
    for (const std::string& command : Commands()) {
        SCOPED_TRACE(command);
        const std::string page = "mavoea-" + command + ".1";
        if (!Exists(kPages + '/' + page)) continue;
        std::set<std::string> has = OptionsIn(Section(Text(page), "OPTIONS"));
        std::set<std::string> wanted = OptionsIn(RunTool({command, "--help"}).out);
        // mavoea(1) has those of every command.
        for (const char* general : {"-h", "--help", "--version", "--color", "--json", "--volume"}) {
            has.erase(general);
            wanted.erase(general);
        }
        EXPECT_EQ(wanted, has);
    }
    const auto general = OptionsIn(Section(Text("mavoea.1"), "OPTIONS"));
    EXPECT_EQ(
        (std::set<std::string>{"-h", "--help", "-V", "--version", "--color", "--json", "--volume"}),
        general);
}

TEST_F(ManualTest, APageOfACommandHasAllThatOneLooksFor) {
    for (const std::string& page : Pages()) {
        SCOPED_TRACE(page);
        const std::string text = Text(page);
        for (const char* title :
             {"NAME", "SYNOPSIS", "DESCRIPTION", "EXAMPLES", "EXIT STATUS", "SEE ALSO"}) {
            const bool command = page.ends_with(".1");
            if (!command && title != std::string("NAME") && title != std::string("SEE ALSO")) {
                continue;
            }
            EXPECT_THAT(text, HasSubstr(std::string("\n") + title + "\n"));
        }
        // Of functions they stand behind it.
        const std::string name = page.substr(0, page.rfind('.'));
        EXPECT_THAT(Section(text, "NAME"),
                    AnyOf(HasSubstr(' ' + name + " - "), HasSubstr(' ' + name + ", ")));
    }
}

// Commands that pages show are there, and are told as ones that mean something.
TEST_F(ManualTest, ExamplesOfAPageAreOfItsCommandAndItsOptions) {
    for (const std::string& command : Commands()) {
        SCOPED_TRACE(command);
        const std::string page = "mavoea-" + command + ".1";
        if (!Exists(kPages + '/' + page)) continue;
        const std::string examples = Section(Text(page), "EXAMPLES");
        EXPECT_THAT(examples, HasSubstr(" " + command + " "));
        const std::set<std::string> known = OptionsIn(RunTool({command, "--help"}).out);
        std::istringstream lines(examples);
        for (std::string line; std::getline(lines, line);) {
            const std::size_t at = line.find("mavoea " + command + ' ');
            if (line.find(" $ ") == std::string::npos || at == std::string::npos) continue;
            std::istringstream words(line.substr(at));
            for (std::string word; words >> word;) {
                if (word == "|" || word == ">" || word == "--") break;
                if (!word.starts_with("--")) continue;
                word.resize(std::min(word.find('='), word.size()));
                if (word == "--json" || word == "--volume") continue;
                EXPECT_EQ(1U, known.count(word)) << line;
            }
        }
    }
}

// Others of this manual that pages refer to.
TEST_F(ManualTest, PagesThatAreReferredToAreThere) {
    static const std::regex kReference("((?:lib)?mavoea[a-z-]*)\\(([0-9])\\)");
    for (const std::string& page : Pages()) {
        const std::string text = Text(page);
        for (std::sregex_iterator at(text.begin(), text.end(), kReference), end; at != end; ++at) {
            EXPECT_TRUE(Exists(kPages + '/' + (*at)[1].str() + '.' + (*at)[2].str()))
                << page << ": " << at->str();
        }
    }
}

TEST_F(ManualTest, NoProgramThatReadsPagesWarns) {
    const auto each = [](const std::string& command) {
        std::string said;
        for (const std::string& page : Pages()) {
            const auto result = RunProgram(command + ' ' + Quoted(kPages + '/' + page) + " 2>&1");
            said += result.output;
        }
        return said;
    };
    EXPECT_THAT(each("LC_ALL=C.UTF-8 MANWIDTH=80 man --warnings -l >/dev/null"), IsEmpty());
    if (!HasProgram("mandoc")) GTEST_SKIP() << "there is no mandoc";
    EXPECT_THAT(each("mandoc -T lint -W error"), IsEmpty());
}

TEST_F(ManualTest, EachPageIsFoundByMansIndex) {
    const TempDir dir;
    for (const std::string& page : Pages()) {
        const std::string directory = dir / ("man/man" + page.substr(page.size() - 1));
        fs::create_directories(directory);
        fs::copy_file(kPages + '/' + page, directory + '/' + page);
    }
    WriteFile(dir / "config", Ascii("MANDB_MAP " + (dir / "man") + ' ' + (dir / "cache") + '\n'));
    const std::string config = " -C " + Quoted(dir / "config") + ' ';
    const auto made = RunProgram("mandb --create --quiet" + config + Quoted(dir / "man") + " 2>&1");
    ASSERT_EQ(0, made.status) << made.output;
    const std::string found =
        RunProgram("man -k -M " + Quoted(dir / "man") + config + "mavoea 2>&1").output;
    for (const std::string& page : Pages()) {
        const std::string name = page.substr(0, page.rfind('.'));
        EXPECT_THAT(found, HasSubstr(name + " (" + page.substr(page.size() - 1) + ")"));
    }
}

}  // namespace
}  // namespace mavoea::test

// Colour in findings and differences: where it is wanted, and nowhere else.

#include <gtest/gtest.h>
#include <stdlib.h>

#include <algorithm>
#include <optional>

#include "tests/support/object_files.h"
#include "tests/tool/holdings.h"
#include "tests/tool/terminal.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

// A variable of the environment, for a while; no value takes it away.
class Variable {
 public:
    Variable(const char* name, const char* value) : name_(name) {
        if (const char* const old = getenv(name)) old_ = old;
        Set(value);
    }
    ~Variable() { Set(old_ ? old_->c_str() : nullptr); }
    Variable(const Variable&) = delete;
    Variable& operator=(const Variable&) = delete;

 private:
    void Set(const char* value) const {
        if (value == nullptr) {
            unsetenv(name_);
        } else {
            setenv(name_, value, 1);
        }
    }

    const char* name_;
    std::optional<std::string> old_;
};

class ColourTest : public ::testing::Test {
 protected:
    ColourTest() {
        for (const char* name : {"one", "two"}) MakeDir(dir_ / name);
        for (const char* name : {"one/a\x1b[31m", "two/a\x1b[31m", "one/b", "two/c"}) {
            WriteFile(dir_ / name, Ascii("data"));
        }
        PutStream(dir_ / "one/a\x1b[31m",
                  StreamImage{.attributes = {{"same", Ascii("1")}, {"left", Ascii("1")}}}.Build());
        PutStream(dir_ / "two/a\x1b[31m",
                  StreamImage{.attributes = {{"same", Ascii("2")}, {"right", Ascii("1")}}}.Build());
        PutStream(dir_ / "one/b", Ascii("no stream"));
    }

    Arguments With(const Arguments& words) const {
        Arguments all = {"--volume", dir_ / "one=1", "--volume", dir_ / "two=1"};
        all.insert(all.end(), words.begin(), words.end());
        return all;
    }
    ToolResult Run(const Arguments& words) const { return RunTool(With(words)); }
    ToolResult Diff(const Arguments& options) const {
        Arguments words = {"diff", "-r", dir_ / "one", dir_ / "two"};
        words.insert(words.end(), options.begin(), options.end());
        return Run(words);
    }
    // What a terminal gets; empty where there is none.
    std::string OnTerminal(const Arguments& words) const { return RunOnTerminal(With(words)).text; }

    const TempDir dir_;
    const Variable terminal_{"TERM", "xterm"};
    const Variable no_color_{"NO_COLOR", nullptr};
};

constexpr char kRedKind[] = ": \x1b[31mdamaged-stream\x1b[0m: ";

TEST_F(ColourTest, FindingsHaveTheirKindInColour) {
    for (const Arguments& words : {Arguments{"check", "--color=always", dir_ / "one/b"},
                                   Arguments{"--color=always", "check", dir_ / "one/b"},
                                   Arguments{"check", "--color", dir_ / "one/b"}}) {
        const std::string out = Run(words).out;
        EXPECT_EQ(dir_ / "one/b" + kRedKind,
                  out.substr(0, out.find(": ", out.find("\x1b[0m")) + 2));
    }
    EXPECT_THAT(Run({"check", "--repair", "--color=always", dir_ / "one/b"}).out,
                HasSubstr("; \x1b[33mleft\x1b[0m: it is no AppleDouble file"));
    EXPECT_THAT(Run({"check", dir_ / "one/b"}).out, Not(HasSubstr("\x1b")));
    EXPECT_THAT(Run({"check", "--color=never", dir_ / "one/b"}).out, Not(HasSubstr("\x1b")));
}

TEST_F(ColourTest, DifferencesAreInColourByTheirSideAndPathsStayEscaped) {
    ASSERT_EQ(0, unlink((dir_ / "one/@eaDir/b@MavoEAStream").c_str()));
    const std::string a = "/a\\x1B[31m";
    EXPECT_EQ("Files " + (dir_ / "one") + a + " and " + (dir_ / "two") + a +
                  " differ: \x1b[31m\"left\" only in the first\x1b[0m, "
                  "\x1b[32m\"right\" only in the second\x1b[0m, "
                  "\x1b[33m\"same\" at byte 0\x1b[0m\n"
                  "\x1b[31mOnly in\x1b[0m " +
                  (dir_ / "one") + ": b\n\x1b[32mOnly in\x1b[0m " + (dir_ / "two") + ": c\n",
              Diff({"--color=always"}).out);
    const std::string plain = Diff({}).out;
    EXPECT_THAT(plain, Not(HasSubstr("\x1b")));
    const std::string itemized = Diff({"-i", "--color=always"}).out;
    EXPECT_THAT(itemized, HasSubstr("\x1b[33m.f.a.....\x1b[0m a\\x1B[31m\n"));
    EXPECT_THAT(itemized, HasSubstr("\x1b[32m>f+++++++\x1b[0m b\n"));
    EXPECT_THAT(itemized, HasSubstr("\x1b[31m*deleting\x1b[0m c\n"));
}

TEST_F(ColourTest, NothingElseHasAny) {
    for (const Arguments& words :
         {Arguments{"--json", "check", dir_ / "one/b"}, Arguments{"list", "-r", dir_ / "two"},
          Arguments{"show", dir_ / "two/c"},
          Arguments{"--json", "diff", "-r", dir_ / "one", dir_ / "two"}}) {
        Arguments coloured = words;
        coloured.insert(coloured.begin(), "--color=always");
        const ToolResult result = Run(coloured);
        EXPECT_EQ(Run(words).out, result.out);
        EXPECT_THAT(result.out + result.err, Not(HasSubstr("\x1b")));
    }
    const ToolResult other = Run({"--color=sometimes", "check", dir_ / "one/b"});
    EXPECT_EQ(2, other.status);
    EXPECT_EQ("", other.out);
}

TEST_F(ColourTest, ATerminalHasItUnlessItOrItsUserSaysOtherwise) {
    const Arguments check = {"check", dir_ / "one/b"};
    const std::string shown = OnTerminal(check);
    if (shown.empty()) GTEST_SKIP() << "there are no terminals here";
    EXPECT_THAT(shown, HasSubstr(kRedKind));
    EXPECT_THAT(OnTerminal({"check", "--color=auto", dir_ / "one/b"}), HasSubstr(kRedKind));
    EXPECT_THAT(OnTerminal({"check", "--color=never", dir_ / "one/b"}), Not(HasSubstr(kRedKind)));
    {
        const Variable none("NO_COLOR", "1");
        EXPECT_THAT(OnTerminal(check), HasSubstr(": damaged-stream: "));
        EXPECT_THAT(OnTerminal({"check", "--color=always", dir_ / "one/b"}), HasSubstr(kRedKind));
    }
    {
        const Variable empty("NO_COLOR", "");  // says nothing
        EXPECT_THAT(OnTerminal(check), HasSubstr(kRedKind));
    }
    for (const char* term : {"dumb", static_cast<const char*>(nullptr)}) {
        const Variable terminal("TERM", term);
        EXPECT_THAT(OnTerminal(check), HasSubstr(": damaged-stream: "));
    }
}

}  // namespace
}  // namespace mavoea::test

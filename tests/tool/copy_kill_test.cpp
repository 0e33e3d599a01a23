// Copies, conversions and moves between file systems that are killed: the same command again brings
// everything to its place, and what it left off in has lost nothing.

#include <signal.h>
#include <unistd.h>

#include <chrono>
#include <random>

#include "tests/support/second_volume.h"
#include "tests/tool/kills.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::Eq;
using ::testing::IsEmpty;

struct Way {
    const char* command;
    int from;
    int to;
};

std::string NameOf(const Way& way) {
    return std::string(way.command) + "From" + std::to_string(way.from) + "To" +
           std::to_string(way.to);
}
void PrintTo(const Way& way, std::ostream* out) { *out << NameOf(way); }

std::vector<Way> AllWays() {
    std::vector<Way> ways;
    for (const char* command : {"cp", "mv", "convert"}) {
        for (const auto& [from, to] :
             {std::pair(kAppleDouble, kAppleDouble), std::pair(kAppleDouble, kEaDirectory),
              std::pair(kEaDirectory, kAppleDouble), std::pair(kEaDirectory, kFileEa),
              std::pair(kXattr, kXattr)}) {
            ways.push_back({command, from, to});
        }
    }
    return Thinned(ways);
}

class CopyKillTest : public ::testing::TestWithParam<Way> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_UNLESS_STOPPED();
        MAVOEA_SKIP_WITHOUT_SECOND(second_);
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second_.path());
        if (root() == "/") GTEST_SKIP() << "the two directories have nothing in common";
        const std::string command = GetParam().command;
        arguments_ = {"--volume", dir_ / "from" + "=" + std::to_string(GetParam().from)};
        if (command == "convert") {
            arguments_.insert(arguments_.end(), {"convert", "-r", "--to", Type(), From(), To()});
            return;
        }
        arguments_.insert(arguments_.end(), {"--volume", second_.path() + "=" + Type(), command});
        if (command == "cp") arguments_.emplace_back("-r");
        arguments_.insert(arguments_.end(), {"-T", From(), To()});
    }

    static std::string Type() { return std::to_string(GetParam().to); }
    static bool Moves() { return std::string(GetParam().command) == "mv"; }
    std::string From() const { return dir_ / "from/tree"; }
    std::string To() const { return second_.path() + "/tree"; }

    // Both directories are in it.
    std::string root() const {
        const std::string common = "/tmp";
        const bool both = dir_.path().starts_with(common) && second_.path().starts_with(common);
        return both ? common : "/";
    }

    void MakeAll() const {
        std::filesystem::remove_all(dir_ / "from");
        for (const std::string& name : NamesIn(second_.path())) {
            std::filesystem::remove_all(second_.path() + '/' + name);
        }
        MakeDir(dir_ / "from");
        MakeDir(From());
        MakeDir(From() + "/inner");
        Make(From() + "/blue", "blue");
        Make(From() + "/inner/green", "green");
        WriteFile(From() + "/plain", Ascii("without metadata"));
    }
    void MakeMany() const {
        constexpr int kDirectories = 3;
        constexpr int kObjects = 15;
        MakeAll();
        for (int i = 0; i < kDirectories; ++i) {
            const std::string directory = From() + "/inner/" + std::to_string(i);
            MakeDir(directory);
            for (int j = 0; j < kObjects; ++j) {
                const std::string number = std::to_string(kObjects * i + j);
                Make(directory + "/object " + number, number);
            }
        }
    }
    void Make(const std::string& path, const std::string& colour) const {
        WriteFile(path, Ascii("data of " + colour));
        const int type = GetParam().from;
        if (UsesAppleDouble(type)) PutAppleDouble(path, AppleDoubleOfColour(colour));
        if (UsesEaDirectory(type)) {
            PutStream(path, AppleDoubleOfColour(colour));
            PutResource(path, PlainAppleDouble(Pattern(32, 0x40), Ascii("fork of " + colour)));
        }
        if (type == kXattr) SetFileAttribute(path, Colour(), Ascii(colour));
    }

    // Everything of each object is at one of the two ends.
    void ExpectNothingLost() const {
        for (const std::string name : {"blue", "inner/green"}) {
            const std::string colour = name.substr(name.rfind('/') + 1);
            EXPECT_TRUE(IsWhole(GetParam().from, From() + '/' + name, colour) ||
                        IsWhole(GetParam().to, To() + '/' + name, colour))
                << name;
        }
    }
    static bool IsWhole(int type, const std::string& path, const std::string& colour) {
        if (!Exists(path) || ReadFile(path) != Ascii("data of " + colour)) return false;
        const ToolResult got = RunTool(
            {"--volume",
             std::filesystem::path(path).parent_path().string() + '=' + std::to_string(type), "get",
             path, Colour()});
        return got.out == colour;
    }

    SecondVolume second_;
    TempDir dir_{"/tmp"};
    Arguments arguments_;
};

// Promise: "The tool: So a metadata file"
// Promise: "The tool: `tests/tool/rename_kill_test.cpp`"
// Promise: "The tool: `cp`, `convert`, `carry` |"
// Promise: "The tool: `mv` between volumes |"
TEST_P(CopyKillTest, TheSameCommandAgainBringsItToItsEnd) {
    MakeAll();
    ASSERT_THAT(RunTool(arguments_).status, Eq(0));
    const auto done = Everything(second_.path());
    ASSERT_TRUE(done.contains("tree/inner/green"));
    KillAtEachChange(
        arguments_, root(), [this] { MakeAll(); },
        [&] {
            ExpectNothingLost();
            const ToolResult again = RunTool(arguments_);
            // Where all was done nothing is there to be moved.
            EXPECT_THAT(again.status, Moves() ? AnyOf(Eq(0), Eq(1)) : AnyOf(Eq(0), Eq(0)))
                << again.err;
            if (again.status == 1) {
                EXPECT_THAT(again.err, ::testing::HasSubstr(From() + "': No such file"));
            }
            EXPECT_THAT(Differences(done, Everything(second_.path())), IsEmpty());
            EXPECT_EQ(!Moves(), Exists(From()));
        },
        second_.path());
}

// A tree that takes long enough to be killed anywhere, by several runs one after the other.
// Promise: "The tool: `cp`, `convert`, `carry` |"
// Promise: "The tool: `mv` between volumes |"
TEST_P(CopyKillTest, RunsThatAreKilledAtAnyTimeAreBroughtToTheirEnd) {
    constexpr int kRounds = 6;
    constexpr int kRuns = 3;
    std::minstd_rand random(20240502);
    MakeMany();
    const auto began = std::chrono::steady_clock::now();
    ASSERT_THAT(RunTool(arguments_).status, Eq(0));
    const auto took = std::chrono::duration_cast<std::chrono::microseconds>(
        std::chrono::steady_clock::now() - began);
    const auto done = Everything(second_.path());
    std::uniform_int_distribution<useconds_t> any_time(0, static_cast<useconds_t>(took.count()));
    for (int round = 0; round < kRounds; round += static_cast<int>(SeriesStep())) {
        SCOPED_TRACE(round);
        MakeMany();
        for (int run = 0; run < kRuns; ++run) {
            RunningTool tool(arguments_);
            usleep(any_time(random));
            tool.Signal(SIGKILL);
            (void)tool.Wait();
        }
        ExpectNothingLost();
        EXPECT_GE(Moves() ? 1 : 0, RunTool(arguments_).status);
        EXPECT_THAT(Differences(done, Everything(second_.path())), IsEmpty());
        EXPECT_EQ(!Moves(), Exists(From()));
    }
}

INSTANTIATE_TEST_SUITE_P(Ways, CopyKillTest, ::testing::ValuesIn(AllWays()),
                         [](const auto& tested) { return NameOf(tested.param); });

}  // namespace
}  // namespace mavoea::test

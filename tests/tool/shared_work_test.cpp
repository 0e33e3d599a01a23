// Objects that several processes change: what there is in the end is what one process makes of
// them, whatever becomes of the processes.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <random>
#include <thread>

#include "tests/tool/holdings.h"
#include "tests/tool/kills.h"
#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::IsEmpty;
using ::testing::SizeIs;

struct Way {
    int from;
    int to;
};
void PrintTo(const Way& way, std::ostream* out) { *out << way.from << " to " << way.to; }

// Mode and modification time of each object, which no metadata file shows.
std::map<std::string, std::string> Looks(const std::string& directory) {
    std::map<std::string, std::string> all;
    for (const std::string& path : Tree(directory)) {
        if (path.find("@eaDir") != std::string::npos || path.find("._") != std::string::npos) {
            continue;
        }
        const struct stat info = StatusOf(directory + '/' + path);
        all[path] = std::to_string(info.st_mode) + ' ' + std::to_string(info.st_nlink) + ' ' +
                    std::to_string(info.st_mtim.tv_sec) + '.' +
                    std::to_string(info.st_mtim.tv_nsec);
    }
    return all;
}

class SharedWorkTest : public ::testing::TestWithParam<Way> {
 protected:
    void Make(const std::string& name, const std::string& colour) const {
        const std::string path = travel_.From(name);
        fs::create_directories(fs::path(path).parent_path());
        travel_.MakeFile(path, "data of " + colour);
        GiveAll(GetParam().from, path, colour, Extent::kOwnOnly);
    }

    // A large directory, a deep narrow tree, many small ones.
    void MakeUsualTree(int size) const {
        for (int i = 0; i < size; ++i) Make("tree/large/" + std::to_string(i), std::to_string(i));
        std::string deep = "tree/deep";
        for (int i = 0; i < 20; ++i) Make((deep += "/d") + "/f", "deep");
        for (int i = 0; i < 15; ++i) Make("tree/small" + std::to_string(i) + "/f", "small");
        fs::create_directories(travel_.From("tree/empty/empty"));
    }

    // With several names of one file, names whose names of metadata are alike, links, what looks
    // like metadata, what nobody may write to.
    void MakeTree() const {
        MakeUsualTree(80);
        const std::string odd = travel_.From("tree/odd");
        fs::create_directories(odd);
        for (const char* name : {"one", "two"}) {
            travel_.MakeFile(odd + '/' + name);
            fs::create_hard_link(odd + '/' + name, odd + "/again " + name);
        }
        fs::create_symlink("one", odd + "/link");
        travel_.MakeFile(odd + "/._nothing", "no metadata");
        for (const char c : {'a', 'b'}) Make("tree/odd/" + std::string(243, 'n') + c, "long");
        fs::permissions(odd, fs::perms(0555));
    }

    Arguments Convert(unsigned jobs, const std::string& to) const {
        return travel_.WithVolumes({"convert", "-r", "-j", std::to_string(jobs), "--to",
                                    std::to_string(GetParam().to), travel_.From("tree"),
                                    travel_.To(to)});
    }

    static std::string Without(std::string text, const std::string& part) {
        for (std::size_t at = 0; (at = text.find(part, at)) != std::string::npos;) {
            text.erase(at, part.size());
        }
        return text;
    }

    const Travel travel_{GetParam().from, GetParam().to};
};

TEST_P(SharedWorkTest, AConversionIsAsOneProcessDoesIt) {
    MakeTree();
    const ToolResult one = RunTool(Convert(1, "one"));
    // Over nothing, and over what is there.
    for (const char* round : {"first", "again"}) {
        SCOPED_TRACE(round);
        for (const unsigned jobs : {2U, 5U}) {
            const std::string name = "by" + std::to_string(jobs);
            const ToolResult more = RunTool(Convert(jobs, name));
            EXPECT_EQ(one.status, more.status);
            EXPECT_EQ(one.out, more.out);
            EXPECT_EQ(Without(one.err, travel_.To("one")), Without(more.err, travel_.To(name)));
            EXPECT_THAT(Differences(Everything(travel_.To("one")), Everything(travel_.To(name))),
                        IsEmpty());
            EXPECT_EQ(Looks(travel_.To("one")), Looks(travel_.To(name)));
        }
    }
}

// Over objects whose metadata goes: some of the EA directories stay empty, and are removed.
TEST_P(SharedWorkTest, WhatStandsThereGivesWay) {
    MakeTree();
    for (const char* to : {"one", "more"}) {
        ASSERT_GE(2, RunTool(Convert(1, to)).status);
    }
    fs::permissions(travel_.From("tree/odd"), fs::perms(0755));
    fs::remove_all(travel_.From("tree"));
    for (int i = 0; i < 150; ++i) {
        fs::create_directories(travel_.From("tree/large"));
        travel_.MakeFile(travel_.From("tree/large/" + std::to_string(i)));
    }
    const ToolResult one = RunTool(Convert(1, "one"));
    const ToolResult more = RunTool(Convert(4, "more"));
    EXPECT_EQ(one.status, more.status);
    EXPECT_EQ(Without(one.out, travel_.To("one")), Without(more.out, travel_.To("more")));
    EXPECT_FALSE(Exists(travel_.To("more/large/@eaDir")));
    EXPECT_THAT(Differences(Everything(travel_.To("one")), Everything(travel_.To("more"))),
                IsEmpty());
}

TEST_P(SharedWorkTest, AComparisonIsAsOneProcessDoesIt) {
    MakeTree();
    (void)RunTool(Convert(1, "copy"));
    WriteFile(travel_.To("copy/large/7"), Ascii("other data"));
    fs::remove(travel_.To("copy/large/8"));
    fs::remove_all(travel_.To("copy/small9"));
    fs::create_directories(travel_.To("copy/more"));
    ASSERT_EQ(0, travel_.Run({"set", travel_.To("copy/large/9"), Colour(), "other"}).status);
    for (const char* manner : {"--data", "--brief", "--itemize-changes", "--json"}) {
        SCOPED_TRACE(manner);
        const auto run = [&](const char* jobs) {
            return travel_.Run(
                {"diff", "-r", manner, "-j", jobs, travel_.From("tree"), travel_.To("copy")});
        };
        const ToolResult one = run("1");
        const ToolResult more = run("4");
        EXPECT_EQ(1, one.status);
        EXPECT_EQ(one.status, more.status);
        EXPECT_EQ(one.out, more.out);
        EXPECT_EQ(one.err, more.err);
    }
}

TEST_P(SharedWorkTest, AfterAnyKillTheSameCommandFinishes) {
    constexpr int kRounds = 3;
    std::minstd_rand random(20240711);
    MakeUsualTree(60);
    const auto began = std::chrono::steady_clock::now();
    const int status = RunTool(Convert(3, "whole")).status;
    const auto took = std::chrono::duration_cast<std::chrono::microseconds>(
        std::chrono::steady_clock::now() - began);
    std::uniform_int_distribution<useconds_t> any_time(0, static_cast<useconds_t>(took.count()));
    for (int round = 0; round < kRounds; round += static_cast<int>(SeriesStep())) {
        SCOPED_TRACE(round);
        for (const int number : {SIGKILL, SIGTERM, SIGKILL}) {
            RunningTool tool(Convert(3, "cut"));
            usleep(any_time(random));
            tool.Signal(number);
            (void)tool.Wait();
        }
        EXPECT_EQ(status, RunTool(Convert(3, "cut")).status);
        EXPECT_THAT(Differences(Everything(travel_.To("whole")), Everything(travel_.To("cut"))),
                    IsEmpty());
        fs::remove_all(travel_.To("cut"));
    }
}

INSTANTIATE_TEST_SUITE_P(
    Ways, SharedWorkTest,
    ::testing::ValuesIn(Thinned(std::vector<Way>{
        {0, 1}, {1, 0}, {0, 0}, {1, 1}, {1, 2}, {2, 7}, {7, 0}, {7, 1}, {7, 7}})),
    [](const auto& tested) {
        return "From" + std::to_string(tested.param.from) + "To" + std::to_string(tested.param.to);
    });

// ---- On one volume ------------------------------------------------------------------------------

// The same objects on two volumes.
class SharedTaskTest : public ::testing::Test {
 protected:
    void Make(const std::string& name, const std::function<void(const std::string&)>& give) const {
        for (const Volume* volume : {&one_, &more_}) {
            const std::string path = volume->path() + '/' + name;
            fs::create_directories(fs::path(path).parent_path());
            WriteFile(path, Ascii("data"));
            give(path);
        }
    }
    void MakeMany(const std::function<void(const std::string&)>& give) const {
        for (int i = 0; i < 150; ++i) Make("tree/large/" + std::to_string(i), give);
        for (int i = 0; i < 15; ++i) Make("tree/small" + std::to_string(i) + "/f", give);
        for (const char c : {'a', 'b'}) Make("tree/odd/" + std::string(243, 'n') + c, give);
    }

    // Once more as well, when there is nothing to be done.
    void ExpectSame(const std::string& command, int status, const std::string& said) const {
        for (const char* round : {"first", "again"}) {
            SCOPED_TRACE(command + ' ' + round);
            const ToolResult one = one_.Run({command, "-r", "-j", "1", one_.path() + "/tree"});
            const ToolResult more = more_.Run({command, "-r", "-j", "4", more_.path() + "/tree"});
            EXPECT_EQ(one.status, more.status);
            EXPECT_EQ(one.out, more.out);
            EXPECT_EQ(At(one.err, one_), At(more.err, more_));
            EXPECT_EQ(Everything(one_.path()), Everything(more_.path()));
            if (*round != 'f') continue;
            EXPECT_EQ(status, more.status) << more.err;
            EXPECT_EQ(said, more.out);
        }
    }

    static std::string At(std::string text, const Volume& volume) {
        for (std::size_t at = 0; (at = text.find(volume.path(), at)) != std::string::npos;) {
            text.erase(at, volume.path().size());
        }
        return text;
    }

    const Volume one_{kEaDirectory};
    const Volume more_{kEaDirectory};
};

TEST_F(SharedTaskTest, AnUpgradeIsAsOneProcessDoesIt) {
    MakeMany([](const std::string& path) {
        PutLegacy(path, "user.k", Ascii(path.substr(path.rfind('/'))));
        PutAppleDouble(path, AppleDoubleOfColour("blue"));
    });
    Make("tree/large/damaged", [](const std::string& path) {
        fs::create_directories(MetadataPaths(path).folder + "/user.no-file");
    });
    const ToolResult one = one_.Run({"upgrade", "-r", "-j", "1", one_.path() + "/tree"});
    const ToolResult more = more_.Run({"upgrade", "-r", "-j", "4", more_.path() + "/tree"});
    EXPECT_EQ(one.status, more.status);
    EXPECT_EQ(one.out, more.out);
    EXPECT_EQ(At(one.err, one_), At(more.err, more_));
    EXPECT_EQ(2, more.status);
    EXPECT_THAT(Differences(Everything(one_.path()), Everything(more_.path())), IsEmpty());
}

// Empty EA directories go, whoever finds them so.
TEST_F(SharedTaskTest, WhatAnUpgradeEmptiesGoes) {
    for (int i = 0; i < 200; ++i) {
        Make("tree/" + std::to_string(i / 50) + '/' + std::to_string(i),
             [](const std::string& path) { fs::create_directories(MetadataPaths(path).folder); });
    }
    ASSERT_TRUE(Exists(more_.path() + "/tree/3/@eaDir"));
    EXPECT_EQ(0, more_.Run({"upgrade", "-r", "-j", "4", more_.path() + "/tree"}).status);
    for (int i = 0; i < 4; ++i) {
        EXPECT_FALSE(Exists(more_.path() + "/tree/" + std::to_string(i) + "/@eaDir")) << i;
    }
}

TEST_F(SharedTaskTest, ARepairIsAsOneProcessDoesIt) {
    MakeMany([](const std::string& path) { PutResource(path, AppleDoubleOfColour("red")); });
    ExpectSame("repair", 0, "167 repaired, 18 with nothing to repair, 0 failed\n");
}

TEST_F(SharedTaskTest, LocksAreAsOneProcessSetsThem) {
    MakeMany([](const std::string&) {});
    ExpectSame("lock", 0, "");
    EXPECT_EQ("1", more_.Run({"get", more_.path() + "/tree/large/77", kLockedName}).out);
    ExpectSame("unlock", 0, "");
    EXPECT_EQ("0", more_.Run({"get", more_.path() + "/tree/large/77", kLockedName}).out);
}

// Ctrl-C on a terminal comes to all of them: what is in hand is finished, and nothing else begun.
TEST(SharedWork, EndsSoonWhenSomebodyAsks) {
    const Travel travel(kEaDirectory, kAppleDouble);
    constexpr int kCount = 3000;
    fs::create_directories(travel.From("tree"));
    for (int i = 0; i < kCount; ++i) {
        const std::string path = travel.From("tree/" + std::to_string(i));
        travel.MakeFile(path);
        GiveAll(kEaDirectory, path, "blue", Extent::kOwnOnly);
    }
    bool cut = false;
    for (int attempt = 0; attempt < 20 && !cut; ++attempt) {
        ToolStart tool(travel.WithVolumes(
            {"convert", "-r", "-j", "3", "--to", "0", travel.From("tree"), travel.To("tree")}));
        const pid_t child = fork();
        if (child == 0) {
            setpgid(0, 0);
            alarm(60);
            freopen("/dev/null", "w", stdout);
            freopen("/dev/null", "w", stderr);
            tool.Exec();
            _exit(127);
        }
        while (!Exists(travel.To("tree"))) std::this_thread::yield();
        while (NamesIn(travel.To("tree")).size() < 20) std::this_thread::yield();
        kill(-child, SIGINT);
        int status = 0;
        ASSERT_EQ(child, waitpid(child, &status, 0));
        ASSERT_TRUE(WIFEXITED(status));
        cut = WEXITSTATUS(status) == 128 + SIGINT;
        const auto objects = Travel::ObjectsIn(travel.To("tree"));
        if (cut) {
            EXPECT_GT(kCount, static_cast<int>(objects.size()));
        }
        for (const std::string& name : objects) {
            ASSERT_TRUE(Exists(travel.To("tree/._" + name))) << name;
        }
        fs::remove_all(travel.To("tree"));
    }
    EXPECT_TRUE(cut);
}

}  // namespace
}  // namespace mavoea::test

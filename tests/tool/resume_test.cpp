// Work that goes on where a run that wrote a log has ended, in whatever way that was.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/file.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <functional>
#include <map>
#include <random>
#include <set>
#include <sstream>

#include "tests/tool/holdings.h"
#include "tests/tool/kills.h"
#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::Contains;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;

constexpr std::size_t kChecksumDigits = 16;

std::vector<std::string> LinesOf(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

// A line of a log: FNV-1a of what is behind it, in digits.
std::string Summed(const std::string& text) {
    std::uint64_t hash = 0xCBF29CE484222325U;
    for (const char c : text) {
        hash = (hash ^ static_cast<std::uint8_t>(c)) * 0x00000100000001B3U;
    }
    std::array<char, kChecksumDigits + 1> digits;
    (void)std::snprintf(digits.data(), digits.size(), "%016llX",
                        static_cast<unsigned long long>(hash));
    return digits.data() + (' ' + text);
}

// What a log has as done: the ends of these lines.
std::multiset<std::string> DoneIn(const std::string& log) {
    std::multiset<std::string> done;
    for (const std::string& line : LinesOf(TextOf(log))) {
        const std::string text = line.substr(std::min(line.size(), kChecksumDigits + 1));
        if (!text.starts_with("done ") || Summed(text) != line) continue;
        done.insert(text.substr(text.find(' ', 5) + 1));
    }
    return done;
}

// Kills a run after a time; false when it had ended by then.
bool KillAfter(const Arguments& arguments, useconds_t time) {
    RunningTool tool(arguments);
    usleep(time);
    tool.Signal(SIGKILL);
    return tool.Wait() == 1000 + SIGKILL;
}

std::chrono::microseconds TimeOf(const std::function<void()>& work) {
    const auto began = std::chrono::steady_clock::now();
    work();
    return std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::steady_clock::now() -
                                                                 began);
}

// ---- convert ------------------------------------------------------------------------------------

class ResumedConversionTest : public ::testing::Test {
 protected:
    void Make(const std::string& name, const std::string& colour) const {
        const std::string path = travel_.From(name);
        fs::create_directories(fs::path(path).parent_path());
        travel_.MakeFile(path, "data of " + colour);
        PutStream(path, AppleDoubleOfColour(colour));
        PutResource(path, PlainAppleDouble(Pattern(32, 0x40), Ascii("fork of " + colour)));
    }
    void MakeTree(int count) const {
        for (int i = 0; i < count; ++i) {
            Make("tree/" + std::to_string(i / 40) + '/' + std::to_string(i), std::to_string(i));
        }
        fs::create_directories(travel_.From("tree/empty"));
    }

    std::string Log() const { return travel_.dir() / "log"; }
    Arguments Convert(Arguments more, const std::string& to = "copy") const {
        more.insert(more.begin(), {"convert", "-r", "--to", "0"});
        more.insert(more.end(), {travel_.From("tree"), travel_.To(to)});
        return travel_.WithVolumes(more);
    }

    // Of each copy, so that one that is made again shows.
    std::map<std::string, ino_t> Inodes() const {
        std::map<std::string, ino_t> all;
        for (const std::string& path : Tree(travel_.To("copy"))) {
            if (path.ends_with('/')) continue;
            all[path] = StatusOf(travel_.To("copy/" + path)).st_ino;
        }
        return all;
    }

    const Travel travel_{kEaDirectory, kAppleDouble};
};

TEST_F(ResumedConversionTest, AfterAnyKillWhatIsLeftIsDoneAndNothingTwice) {
    constexpr int kRounds = 6;
    std::minstd_rand random(20240803);
    MakeTree(400);
    ToolResult whole;
    const auto took = TimeOf([&] { whole = RunTool(Convert({}, "whole")); });
    ASSERT_EQ(0, whole.status);
    std::uniform_int_distribution<useconds_t> any_time(0, static_cast<useconds_t>(took.count()));
    for (int round = 0; round < kRounds; round += static_cast<int>(SeriesStep())) {
        SCOPED_TRACE(round);
        const std::string jobs = round % 2 == 0 ? "1" : "3";
        Arguments arguments = Convert({"-j", jobs, "--log", Log()});
        for (int kill = 0; kill < 3 && KillAfter(arguments, any_time(random)); ++kill) {
            if (Exists(Log())) arguments = Convert({"-j", jobs, "--resume", Log()});
        }
        const auto inodes = Exists(travel_.To("copy")) ? Inodes() : std::map<std::string, ino_t>();
        const auto done = Exists(Log()) ? DoneIn(Log()) : std::multiset<std::string>();
        const ToolResult end = RunTool(Exists(Log()) ? Convert({"-j", jobs, "--resume", Log()})
                                                     : Convert({"--log", Log()}));
        EXPECT_EQ(0, end.status) << end.err;
        EXPECT_EQ(whole.out, end.out);
        EXPECT_THAT(Differences(Everything(travel_.To("whole")), Everything(travel_.To("copy"))),
                    IsEmpty());
        const auto now = Inodes();
        for (const std::string& key : done) {
            const std::size_t at = key.find("/from/tree/");
            if (!key.starts_with("3 ") || at == std::string::npos) continue;
            const std::string path = key.substr(at + std::string("/from/tree/").size());
            EXPECT_EQ(inodes.at(path), now.at(path)) << path;
        }
        const auto all = DoneIn(Log());
        for (const std::string& key : all) {
            if (!key.starts_with("3 ")) continue;
            EXPECT_EQ(1U, all.count(key)) << key;
        }
        fs::remove_all(travel_.To("copy"));
        fs::remove(Log());
    }
}

// A run that was killed in the middle of a line.
TEST_F(ResumedConversionTest, ALineThatWasCutShortDoesNotCount) {
    MakeTree(30);
    const ToolResult whole = RunTool(Convert({"--log", Log()}));
    ASSERT_EQ(0, whole.status);
    const std::string text = TextOf(Log());
    const std::string first = LinesOf(text).front();
    for (std::size_t size = text.size(); size > first.size();
         size -= std::min(size, 61 * SeriesStep())) {
        SCOPED_TRACE(size);
        WriteFile(Log(), Ascii(text.substr(0, size)));
        const ToolResult end = RunTool(Convert({"--resume", Log()}));
        EXPECT_EQ(0, end.status) << end.err;
        EXPECT_EQ(whole.out, end.out);
        const auto done = DoneIn(Log());
        EXPECT_EQ(DoneIn(Log()).size(), std::set<std::string>(done.begin(), done.end()).size());
        EXPECT_LE(32U, done.size());
    }
}

TEST_F(ResumedConversionTest, ADamagedLineDoesNotCount) {
    MakeTree(30);
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    std::string text = TextOf(Log());
    const auto before = Inodes();
    const std::size_t at = text.find("tree/0/17\n");
    ASSERT_NE(std::string::npos, at);
    text[at - 3] ^= 1;
    WriteFile(Log(), Ascii(text));
    EXPECT_EQ(0, RunTool(Convert({"--resume", Log()})).status);
    const auto after = Inodes();
    for (const auto& [path, inode] : before) {
        const bool again = path == "0/17" || path == "0/._17";
        EXPECT_EQ(again, inode != after.at(path)) << path;
    }
}

// What had not been put on disk when the system went down is done again.
TEST_F(ResumedConversionTest, AfterALossOfPowerOnlyWhatWasOnDiskCounts) {
    MakeTree(30);
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    std::vector<std::string> lines = LinesOf(TextOf(Log()));
    std::string log;
    for (std::string& line : lines) {
        const std::string text = line.substr(kChecksumDigits + 1);
        if (text.starts_with("disk ")) continue;
        line = text.starts_with("run ") ? Summed("run of another time") : line;
        log += line + '\n';
        // Before the line of "tree/0/17" it had been synced.
        if (line.ends_with("tree/0/16")) log += Summed("disk " + std::to_string(log.size())) + '\n';
    }
    WriteFile(Log(), Ascii(log));
    const auto before = Inodes();
    const ToolResult end = RunTool(Convert({"--resume", Log()}));
    EXPECT_EQ(0, end.status);
    EXPECT_EQ("33 converted, 33 compared, 0 differences, 0 failed\n", end.out);
    const auto after = Inodes();
    // In the order of the names.
    for (const char* path : {"0/0", "0/10", "0/16"}) EXPECT_EQ(before.at(path), after.at(path));
    for (const char* path : {"0/17", "0/2", "0/9"}) EXPECT_NE(before.at(path), after.at(path));
}

TEST_F(ResumedConversionTest, WhatHasChangedSinceIsDoneAgain) {
    MakeTree(5);
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    WriteFile(travel_.From("tree/0/3"), Ascii("other data"));
    const auto before = Inodes();
    EXPECT_EQ(0, RunTool(Convert({"--resume", Log()})).status);
    EXPECT_EQ("other data", TextOf(travel_.To("copy/0/3")));
    EXPECT_EQ(before.at("0/2"), Inodes().at("0/2"));
}

TEST_F(ResumedConversionTest, WhatHasFailedIsTriedAgainAndTheReportIsThatOfTheWhole) {
    MakeTree(5);
    fs::create_directories(travel_.To("copy/0/3"));  // in the way
    const ToolResult first = RunTool(Convert({"--log", Log()}));
    EXPECT_EQ(2, first.status);
    EXPECT_THAT(first.out, HasSubstr("7 converted"));
    fs::remove_all(travel_.To("copy/0/3"));
    const ToolResult second = RunTool(Convert({"--resume", Log()}));
    EXPECT_EQ(0, second.status) << second.err;
    EXPECT_EQ("8 converted, 8 compared, 0 differences, 0 failed\n", second.out);
    EXPECT_EQ("3", travel_.Run({"get", travel_.To("copy/0/3"), Colour()}).out);
}

TEST_F(ResumedConversionTest, NamesOfOneFileStayNamesOfOneFile) {
    MakeTree(3);
    fs::create_hard_link(travel_.From("tree/0/1"), travel_.From("tree/0/again"));
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    // Up to the first of the two.
    std::string text = TextOf(Log());
    text.resize(text.find("tree/0/1\n") + std::string("tree/0/1\n").size());
    WriteFile(Log(), Ascii(text));
    fs::remove(travel_.To("copy/0/again"));
    fs::remove(travel_.To("copy/0/._again"));
    EXPECT_EQ(0, RunTool(Convert({"--resume", Log()})).status);
    EXPECT_EQ(StatusOf(travel_.To("copy/0/1")).st_ino, StatusOf(travel_.To("copy/0/again")).st_ino);
}

TEST_F(ResumedConversionTest, TheTimeOfADirectoryIsRightAfterFurtherCopies) {
    MakeTree(3);
    const timespec time = {1000000000, 0};
    const timespec times[2] = {time, time};
    ASSERT_EQ(0, utimensat(AT_FDCWD, travel_.From("tree/0").c_str(), times, 0));
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    std::string text = TextOf(Log());
    const std::size_t at = text.find("tree/0/1\n");
    text[at - 2] ^= 1;
    WriteFile(Log(), Ascii(text));
    EXPECT_EQ(0, RunTool(Convert({"--resume", Log()})).status);
    EXPECT_EQ(1000000000, StatusOf(travel_.To("copy/0")).st_mtim.tv_sec);
}

// ---- Which files are taken ----------------------------------------------------------------------

TEST_F(ResumedConversionTest, LogsOfOtherWorkAreRefused) {
    MakeTree(2);
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    const ToolResult other = RunTool(Convert({"--resume", Log()}, "elsewhere"));
    EXPECT_EQ(2, other.status);
    EXPECT_THAT(other.err, HasSubstr("it is the log of other work: convert all of " +
                                     travel_.From("tree") + " to " + travel_.To("copy")));
    EXPECT_FALSE(Exists(travel_.To("elsewhere")));
    EXPECT_EQ(2, travel_.Run({"check", "-r", "--resume", Log(), travel_.source()}).status);
}

TEST_F(ResumedConversionTest, OtherFilesAreRefused) {
    MakeTree(2);
    const std::string file = travel_.dir() / "file";
    for (const char* text : {"\n", "mavoea", "0123456789ABCDEF mavoea-log-1-little x y\n"}) {
        WriteFile(file, Ascii(text));
        const ToolResult run = RunTool(Convert({"--resume", file}));
        EXPECT_THAT(run, Failed(2, file + ": it is no log of this tool; begin a new one with --log "
                                          "FILE"));
        EXPECT_EQ(text, TextOf(file));
    }
    EXPECT_EQ(1, RunTool(Convert({"--resume", travel_.dir() / "none"})).status);
    EXPECT_EQ(2, RunTool(Convert({"--resume", travel_.source()})).status);
    EXPECT_FALSE(Exists(travel_.To("copy")));
}

TEST_F(ResumedConversionTest, NoFileIsWrittenOver) {
    MakeTree(2);
    WriteFile(Log(), Ascii("a file"));
    EXPECT_THAT(RunTool(Convert({"--log", Log()})),
                Failed(2, Log() + ": it is there already; go on with it by --resume, or name "
                                  "another one"));
    EXPECT_EQ("a file", TextOf(Log()));
    const std::string link = travel_.dir() / "link";
    fs::create_symlink(travel_.dir() / "elsewhere", link);
    EXPECT_EQ(2, RunTool(Convert({"--log", link})).status);
    EXPECT_FALSE(Exists(travel_.dir() / "elsewhere"));
    EXPECT_FALSE(Exists(travel_.To("copy")));
}

// Others could have written into it that all is done.
TEST_F(ResumedConversionTest, ALogThatOthersMayHaveWrittenIsRefused) {
    MakeTree(2);
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    const ToolResult expected = {2, "",
                                 "mavoea: " + Log() +
                                     ": others may have written to it; go on with a log "
                                     "that is this user's own\n"};
    for (const mode_t mode : {0620U, 0602U}) {
        ASSERT_EQ(0, chmod(Log().c_str(), mode));
        EXPECT_EQ(expected.err, RunTool(Convert({"--resume", Log()})).err);
    }
    ASSERT_EQ(0, chmod(Log().c_str(), 0600));
    const std::string other = travel_.dir() / "other";
    fs::create_hard_link(Log(), other);
    EXPECT_EQ(expected.err, RunTool(Convert({"--resume", Log()})).err);
    fs::remove(other);
    EXPECT_EQ(0, RunTool(Convert({"--resume", Log()})).status);
    if (geteuid() != 0) return;
    ASSERT_EQ(0, chown(Log().c_str(), 4242, 4242));
    EXPECT_EQ(expected.err, RunTool(Convert({"--resume", Log()})).err);
}

TEST_F(ResumedConversionTest, OneRunAtATimeWritesToALog) {
    MakeTree(2);
    ASSERT_EQ(0, RunTool(Convert({"--log", Log()})).status);
    const int fd = open(Log().c_str(), O_RDONLY | O_CLOEXEC);
    ASSERT_EQ(0, flock(fd, LOCK_EX));
    EXPECT_THAT(RunTool(Convert({"--resume", Log()})),
                Failed(2, Log() + ": another run writes to it; wait until that has ended"));
    close(fd);
    EXPECT_EQ(0, RunTool(Convert({"--resume", Log()})).status);
}

// The work is done, and the status says that the log does not have all of it.
TEST_F(ResumedConversionTest, ALogThatTakesNoMoreIsAFailure) {
    MakeTree(100);
    const Limits small = {.file_size = 8192};
    for (const char* jobs : {"1", "2"}) {
        const ToolResult run = RunTool(Convert({"-j", jobs, "--log", Log()}), {}, small);
        EXPECT_EQ(2, run.status);
        EXPECT_THAT(run.err, HasSubstr(Log()));
        EXPECT_THAT(run.out, HasSubstr("105 converted"));
        fs::remove(Log());
        fs::remove_all(travel_.To("copy"));
    }
}

TEST_F(ResumedConversionTest, TheTwoOptionsExcludeEachOther) {
    MakeTree(2);
    EXPECT_EQ(2, RunTool(Convert({"--log", Log(), "--resume", Log()})).status);
    EXPECT_FALSE(Exists(Log()));
}

TEST_F(ResumedConversionTest, APlanIsCarriedOnAsWell) {
    MakeTree(3);
    const std::string plan = travel_.dir() / "plan";
    ASSERT_EQ(0, travel_
                     .Run({"plan", "-r", "--to", "0", "--output", plan, travel_.From("tree"),
                           travel_.To("copy")})
                     .status);
    EXPECT_EQ(0, travel_.Run({"convert", "--plan", plan, "--log", Log()}).status);
    const auto before = Inodes();
    EXPECT_EQ(0, travel_.Run({"convert", "--plan", plan, "--resume", Log()}).status);
    EXPECT_EQ(before, Inodes());
}

// ---- On one volume ------------------------------------------------------------------------------

class ResumedTaskTest : public ::testing::Test {
 protected:
    void Make(const std::function<void(const std::string&, int)>& give, int count = 300) const {
        for (int i = 0; i < count; ++i) {
            const std::string path =
                volume_.path() + "/tree/" + std::to_string(i / 50) + '/' + std::to_string(i);
            fs::create_directories(fs::path(path).parent_path());
            WriteFile(path, Ascii("data"));
            give(path, i);
        }
    }

    Arguments Task(const std::string& command, Arguments more) const {
        more.insert(more.begin(), {"--volume", volume_.path() + "=1", command, "-r"});
        more.push_back(volume_.path() + "/tree");
        return more;
    }

    // Counts may differ by what each process had in hand: that it was done was not written yet.
    static void ExpectSaid(const std::string& wanted, const std::string& said,
                           const std::string& jobs) {
        if (said == wanted) return;
        const int least = std::stoi(wanted) - std::stoi(jobs);
        EXPECT_LE(least, std::stoi(said)) << said;
        EXPECT_THAT(said, EndsWith(", 0 failed\n"));
    }

    // `make` makes the objects anew.
    void ExpectTheWhole(const std::string& command, const std::function<void()>& make,
                        int status) const {
        constexpr int kRounds = 4;
        std::minstd_rand random(20240804);
        const std::string log = dir_ / "log";
        const auto make_anew = [&] {
            fs::remove_all(volume_.path() + "/tree");
            make();
        };
        make_anew();
        ToolResult whole;
        const auto took = TimeOf([&] { whole = RunTool(Task(command, {})); });
        EXPECT_EQ(status, whole.status) << whole.err;
        const auto made = Everything(volume_.path());
        std::uniform_int_distribution<useconds_t> any_time(0,
                                                           static_cast<useconds_t>(took.count()));
        for (int round = 0; round < kRounds; round += static_cast<int>(SeriesStep())) {
            SCOPED_TRACE(command + ' ' + std::to_string(round));
            const std::string jobs = round % 2 == 0 ? "1" : "3";
            make_anew();
            (void)KillAfter(Task(command, {"-j", jobs, "--log", log}), any_time(random));
            if (!Exists(log)) continue;
            const ToolResult end = RunTool(Task(command, {"-j", jobs, "--resume", log}));
            EXPECT_EQ(whole.status, end.status);
            ExpectSaid(whole.out, end.out, jobs);
            EXPECT_EQ(whole.err, end.err);
            EXPECT_THAT(Differences(made, Everything(volume_.path())), IsEmpty());
            // Once more there is nothing to do, and the same to say.
            const auto done = DoneIn(log);
            EXPECT_EQ(end.out, RunTool(Task(command, {"--resume", log})).out);
            EXPECT_EQ(done, DoneIn(log));
            fs::remove(log);
        }
    }

    const Volume volume_{kEaDirectory};
    const TempDir dir_;
};

TEST_F(ResumedTaskTest, AllFindingsOfACheckAreSaid) {
    ExpectTheWhole(
        "check",
        [&] {
            Make([](const std::string& path, int i) {
                Bytes stream = AppleDoubleOfColour("blue");
                if (i % 7 == 0) stream.resize(stream.size() - 1);
                PutStream(path, stream);
            });
        },
        1);
}

TEST_F(ResumedTaskTest, AnUpgradeCountsAllThatWasUpgraded) {
    ExpectTheWhole(
        "upgrade",
        [&] {
            Make([](const std::string& path, int i) {
                if (i % 3 == 0) PutLegacy(path, kLegacyName, Ascii("sizes"));
            });
        },
        0);
}

TEST_F(ResumedTaskTest, ARepairCountsAllThatWasRepaired) {
    ExpectTheWhole(
        "repair",
        [&] {
            Make([](const std::string& path, int i) {
                if (i % 3 == 0) PutResource(path, AppleDoubleOfColour("red"));
            });
        },
        0);
}

TEST_F(ResumedTaskTest, ShardsHaveLogsOfTheirOwn) {
    Make([](const std::string& path, int) { PutStream(path, AppleDoubleOfColour("blue")); }, 20);
    const std::string log = dir_ / "log";
    EXPECT_EQ(0, RunTool(Task("check", {"--shard", "1/2", "--log", log})).status);
    EXPECT_EQ(0, RunTool(Task("check", {"--shard", "1/2", "--resume", log})).status);
    EXPECT_THAT(RunTool(Task("check", {"--shard", "2/2", "--resume", log})).err,
                HasSubstr(volume_.path() + "/tree, shard 1/2; give the command as it was"));
}

}  // namespace
}  // namespace mavoea::test

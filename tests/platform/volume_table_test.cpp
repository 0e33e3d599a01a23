// The volume table: its file line by line, lookup, reloading, reports.

#include "platform/core/volume_table.h"

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <thread>
#include <vector>

#include "platform/core/lexical_path.h"
#include "platform/include/mavocore.h"
#include "tests/platform/support/allocation_control.h"
#include "tests/platform/support/private_mounts.h"
#include "tests/platform/support/syslog_capture.h"
#include "tests/support/temp_dir.h"

namespace mavoea::core {
namespace {

using test::Ascii;
using test::TakeSyslog;
using test::WriteFile;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::StartsWith;

class VolumeTableTest : public ::testing::Test {
 protected:
    VolumeTableTest() { TakeSyslog(); }
    ~VolumeTableTest() override { table_.Clear(); }

    // A new file each time, so that no clock has to tick for it to differ.
    void SetFile(std::string_view text) {
        WriteFile(file_ + ".new", Ascii(text));
        ASSERT_EQ(0, std::rename((file_ + ".new").c_str(), file_.c_str()));
    }

    std::string Report(int line, const std::string& complaint) const {
        return "<4>" + file_ + ":" + std::to_string(line) + " " + complaint + ", line skipped";
    }

    const test::TempDir dir_;
    const std::string file_ = dir_ / "volumes";
    VolumeTable table_{file_.c_str()};
};

std::string Normalized(std::string_view path) {
    std::string out(path.size(), '#');
    out.resize(NormalizePath(path, out.data()));
    return out;
}

TEST(NormalizePathTest, ComponentsAreKeptAndTheRestGoes) {
    EXPECT_EQ("", Normalized("/"));
    EXPECT_EQ("", Normalized("///"));
    EXPECT_EQ("/a", Normalized("/a"));
    EXPECT_EQ("/a/b", Normalized("//a///b//"));
    EXPECT_EQ("/a/b", Normalized("/./a/./b/."));
    EXPECT_EQ("/b", Normalized("/a/../b"));
    EXPECT_EQ("", Normalized("/a/.."));
    EXPECT_EQ("/b", Normalized("/../../b"));
    EXPECT_EQ("/a", Normalized("/a/b/c/../.."));
    EXPECT_EQ("/.a/..b/...", Normalized("/.a/..b/..."));
}

TEST_F(VolumeTableTest, AMissingFileIsNoErrorAndKnowsNothing) {
    errno = ERANGE;
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_EQ(ERANGE, errno);
    EXPECT_THAT(TakeSyslog(), IsEmpty());
}

TEST_F(VolumeTableTest, EveryLineOfPathAndTypeCounts) {
    SetFile(
        "# volumes of this host\n"
        "\n"
        "/v1 1\n"
        "   /v2\t\t0   \n"
        "/v3 appledouble\n"
        "/v4 eadir\n"
        "/v5 fileea\n"
        "/v6 xattr\r\n"
        "/my own disk 2\n"
        "  # not a volume 3\n"
        "   \t \n"
        "/v12 12\n"
        "/v//8/./x/../ 07\n"
        "/hash #1 3\n"
        "/last 10");
    EXPECT_EQ(1, table_.Find("/v1"));
    EXPECT_EQ(0, table_.Find("/v2"));
    EXPECT_EQ(0, table_.Find("/v3"));
    EXPECT_EQ(1, table_.Find("/v4"));
    EXPECT_EQ(2, table_.Find("/v5"));
    EXPECT_EQ(7, table_.Find("/v6"));
    EXPECT_EQ(2, table_.Find("/my own disk"));
    EXPECT_EQ(12, table_.Find("/v12"));
    EXPECT_EQ(7, table_.Find("/v/8"));
    EXPECT_EQ(3, table_.Find("/hash #1"));
    EXPECT_EQ(10, table_.Find("/last"));
    EXPECT_EQ(-1, table_.Find("/my own"));
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_THAT(TakeSyslog(), IsEmpty());
}

TEST_F(VolumeTableTest, EveryMalformedLineIsReportedOnceAndSkipped) {
    SetFile(
        "relative 1\n"
        "/no-type\n"
        "/typo eadri\n"
        "/good 1\n"
        "/too-big 13\n"
        "/too-long 007\n"
        "/negative -1\n"
        "/signed +1\n"
        "/case EADIR\n"
        "1\n"
        "/comment 1 # here\n"
        "/good/too 2\n");
    EXPECT_EQ(1, table_.Find("/good"));
    EXPECT_EQ(2, table_.Find("/good/too"));
    EXPECT_EQ(-1, table_.Find("/typo"));
    EXPECT_EQ(-1, table_.Find("/comment"));
    const std::string no_type = "does not end in a volume type";
    EXPECT_THAT(
        TakeSyslog(),
        ElementsAre(Report(1, "does not begin with an absolute path"), Report(2, "has no type"),
                    Report(3, no_type), Report(5, no_type), Report(6, no_type), Report(7, no_type),
                    Report(8, no_type), Report(9, no_type),
                    Report(10, "does not begin with an absolute path"), Report(11, no_type)));
    table_.Find("/good");
    EXPECT_THAT(TakeSyslog(), IsEmpty());
}

TEST_F(VolumeTableTest, ALineWithANulIsMalformed) {
    using namespace std::string_view_literals;
    SetFile("/a\0b 1\n/c 1\n"sv);
    EXPECT_EQ(-1, table_.Find("/a"));
    EXPECT_EQ(1, table_.Find("/c"));
    EXPECT_THAT(TakeSyslog(), ElementsAre(Report(1, "holds a NUL")));
}

TEST_F(VolumeTableTest, AVolumeHoldsWhatIsInsideByWholeComponents) {
    SetFile("/v 1\n");
    EXPECT_EQ(1, table_.Find("/v"));
    EXPECT_EQ(1, table_.Find("/v/a/b"));
    EXPECT_EQ(-1, table_.Find("/volume"));
    EXPECT_EQ(-1, table_.Find("/u/v"));
    EXPECT_EQ(-1, table_.Find(""));
}

TEST_F(VolumeTableTest, TheLongestPathWinsWhereverItStands) {
    SetFile("/v/a/b 3\n/v 1\n/v/a 2\n");
    EXPECT_EQ(1, table_.Find("/v/x"));
    EXPECT_EQ(2, table_.Find("/v/a/x"));
    EXPECT_EQ(3, table_.Find("/v/a/b/x"));
}

TEST_F(VolumeTableTest, TheRootIsAVolumeThatHoldsEverything) {
    SetFile("/v 1\n/ 2\n");
    EXPECT_EQ(2, table_.Find(""));
    EXPECT_EQ(2, table_.Find("/x"));
    EXPECT_EQ(1, table_.Find("/v/x"));
}

TEST_F(VolumeTableTest, TheLaterOfTwoLinesWithTheSamePathCounts) {
    SetFile("/v 1\n/v/ 2\n");
    EXPECT_EQ(2, table_.Find("/v"));
}

TEST_F(VolumeTableTest, ADeclarationWinsOverAnEqualPathAndALongerPathOverBoth) {
    SetFile("/v 1\n/w 1\n/w/long 3\n/x/long 6\n");
    ASSERT_TRUE(table_.Declare("/v/", 2));
    ASSERT_TRUE(table_.Declare("/w", 7));
    ASSERT_TRUE(table_.Declare("/x/long/longer", 0));
    EXPECT_EQ(2, table_.Find("/v/a"));
    EXPECT_EQ(7, table_.Find("/w/a"));
    EXPECT_EQ(3, table_.Find("/w/long/a"));
    EXPECT_EQ(6, table_.Find("/x/long/a"));
    EXPECT_EQ(0, table_.Find("/x/long/longer/a"));
    ASSERT_TRUE(table_.Declare("//v", 5));
    EXPECT_EQ(5, table_.Find("/v/a")) << "a second declaration replaces the first";
}

TEST_F(VolumeTableTest, AChangedFileIsReadAgainAndItsFaultsReportedAgain) {
    SetFile("/v 1\nbad\n");
    EXPECT_EQ(1, table_.Find("/v"));
    EXPECT_EQ(1u, TakeSyslog().size());
    SetFile("/v 2\nbad\n");  // same size, another file
    EXPECT_EQ(2, table_.Find("/v"));
    EXPECT_EQ(1u, TakeSyslog().size());

    WriteFile(file_, Ascii("/v 10\n"));  // same file, another size
    EXPECT_EQ(10, table_.Find("/v"));

    ASSERT_EQ(0, unlink(file_.c_str()));
    EXPECT_EQ(-1, table_.Find("/v"));
    SetFile("/v 3\n");
    EXPECT_EQ(3, table_.Find("/v"));
    EXPECT_THAT(TakeSyslog(), IsEmpty());
}

TEST_F(VolumeTableTest, AnotherTimeOfChangeIsEnoughToReadAgain) {
    WriteFile(file_, Ascii("/v 1\n"));
    timespec times[2] = {{1000, 5}, {1000, 5}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, file_.c_str(), times, 0));
    EXPECT_EQ(1, table_.Find("/v"));
    WriteFile(file_, Ascii("/v 2\n"));
    times[1].tv_nsec = 6;
    ASSERT_EQ(0, utimensat(AT_FDCWD, file_.c_str(), times, 0));
    EXPECT_EQ(2, table_.Find("/v"));
}

TEST_F(VolumeTableTest, WhatIsNoRegularFileIsReportedOnceAndNeverWaitedFor) {
    ASSERT_EQ(0, mkfifo(file_.c_str(), 0600));
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_THAT(TakeSyslog(), ElementsAre(StartsWith("<4>" + file_ + " cannot be read: ")));

    ASSERT_EQ(0, unlink(file_.c_str()));
    ASSERT_EQ(0, mkdir(file_.c_str(), 0700));
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_THAT(TakeSyslog(), ElementsAre(HasSubstr("cannot be read")));
}

TEST_F(VolumeTableTest, AFileThatMayNotBeReadIsReportedOnce) {
    SetFile("/v 1\n");
    ASSERT_EQ(0, chmod(file_.c_str(), 0600));
    int type;
    {
        const test::AsNobody nobody;
        if (!nobody.ok()) GTEST_SKIP() << "needs the superuser";
        table_.Find("/v");
        type = table_.Find("/v");
    }
    EXPECT_EQ(-1, type);
    EXPECT_THAT(TakeSyslog(), ElementsAre("<4>" + file_ + " cannot be read: Permission denied"));
}

TEST_F(VolumeTableTest, OutOfMemoryTheLastStateStaysAndLoadingIsTriedAgain) {
    SetFile("/old 1\n");
    EXPECT_EQ(1, table_.Find("/old"));
    SetFile("/new 2\n/new/er 3\n");
    int faults = 0;
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        bool fired;
        int type;
        {
            test::FailNthAllocation fault(nth);
            errno = ERANGE;
            type = table_.Find("/old");
            fired = fault.fired();
        }
        EXPECT_EQ(ERANGE, errno);
        if (!fired) {
            EXPECT_EQ(-1, type);
            break;
        }
        EXPECT_EQ(1, type);
        ++faults;
    }
    EXPECT_EQ(3, faults) << "two paths and the list";
    EXPECT_EQ(3, table_.Find("/new/er"));
    EXPECT_THAT(TakeSyslog(), IsEmpty());
}

TEST_F(VolumeTableTest, ADeclarationThatRunsOutOfMemoryChangesNothing) {
    for (int nth = 1; nth <= 2; ++nth) {
        bool done;
        {
            test::FailNthAllocation fault(nth);
            done = table_.Declare("/v", 1);
        }
        EXPECT_FALSE(done);
        EXPECT_EQ(-1, table_.Find("/v"));
    }
}

TEST_F(VolumeTableTest, ManyVolumesAreKept) {
    for (int i = 0; i < 200; ++i) ASSERT_TRUE(table_.Declare("/v/" + std::to_string(i), i % 13));
    for (int i = 0; i < 200; ++i) {
        EXPECT_EQ(i % 13, table_.Find("/v/" + std::to_string(i) + "/x"));
    }
}

TEST_F(VolumeTableTest, ThreadsMayAskAndDeclareWhileTheFileChanges) {
    SetFile("/v 1\n");
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t) {
        threads.emplace_back([this, t] {
            for (int i = 0; i < 200; ++i) {
                const int type = table_.Find("/v/a");
                EXPECT_TRUE(type == 1 || type == 2) << type;
                EXPECT_TRUE(table_.Declare("/t/" + std::to_string(t) + "/" + std::to_string(i), 3));
            }
        });
    }
    for (int i = 0; i < 50; ++i) SetFile(i % 2 == 0 ? "/v 2\n" : "/v 1\n");
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(3, table_.Find("/t/3/199"));
}

TEST(VolumeTypeFromNameTest, NumbersFrom0To12AndFourNamesAreTypes) {
    for (int type = 0; type <= 12; ++type) {
        EXPECT_EQ(type, MAVOVolumeTypeFromName(std::to_string(type).c_str()));
    }
    EXPECT_EQ(0, MAVOVolumeTypeFromName("appledouble"));
    EXPECT_EQ(1, MAVOVolumeTypeFromName("eadir"));
    EXPECT_EQ(2, MAVOVolumeTypeFromName("fileea"));
    EXPECT_EQ(7, MAVOVolumeTypeFromName("xattr"));
    for (const char* none :
         {"", "13", "99", "100", "-1", "+1", " 1", "1 ", "1x", "eadir2", "EADir"}) {
        EXPECT_EQ(-1, MAVOVolumeTypeFromName(none)) << none;
    }
    EXPECT_EQ(-1, MAVOVolumeTypeFromName(nullptr));
}

}  // namespace
}  // namespace mavoea::core

// The volume table: its file line by line, lookup, reloading, reports.

#include "platform/core/volume_table.h"

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string.h>
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
using ::testing::FieldsAre;
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

    // "TYPE declared" or "TYPE line LINE", "none" when the table knows of no volume.
    std::string EntryOf(std::string_view path) {
        MAVOVolumeEntry entry = {-2, -2, -2};
        if (!table_.Find(path, &entry)) {
            EXPECT_THAT(entry, FieldsAre(-2, -2, -2));
            return "none";
        }
        return Text(entry);
    }

    static std::string Text(const MAVOVolumeEntry& entry) {
        const std::string type = std::to_string(entry.type);
        if (entry.source == MAVO_VOLUME_DECLARED && entry.line == 0) return type + " declared";
        EXPECT_EQ(MAVO_VOLUME_LISTED, entry.source);
        return type + " line " + std::to_string(entry.line);
    }

    // "LINE: PROBLEM", "cannot be read: ERROR", or nothing.
    std::string Fault() {
        errno = ERANGE;
        const VolumeTable::Fault fault = table_.Check();
        EXPECT_EQ(ERANGE, errno);
        if (fault.error != 0) return std::string("cannot be read: ") + strerrorname_np(fault.error);
        EXPECT_EQ(fault.line == 0, fault.problem == nullptr);
        return fault.line == 0 ? "" : std::to_string(fault.line) + ": " + fault.problem;
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

TEST_F(VolumeTableTest, AnEntryTellsWhetherItIsDeclaredAndWhichLineItStandsOn) {
    SetFile(
        "# volumes\n"
        "/v 1\n"
        "not a volume\n"
        "\n"
        "/w 2\n"
        "/w/long 3\n"
        "/v/ 7");
    EXPECT_EQ("7 line 7", EntryOf("/v/a")) << "the later of two lines";
    EXPECT_EQ("2 line 5", EntryOf("/w"));
    EXPECT_EQ("3 line 6", EntryOf("/w/long/a"));
    EXPECT_EQ("none", EntryOf("/x"));
    EXPECT_EQ("none", EntryOf(""));

    ASSERT_TRUE(table_.Declare("/w", 0));
    ASSERT_TRUE(table_.Declare("/v/deep", 10));
    EXPECT_EQ("0 declared", EntryOf("/w/a")) << "of equal paths";
    EXPECT_EQ("3 line 6", EntryOf("/w/long/a")) << "the longer path";
    EXPECT_EQ("10 declared", EntryOf("/v/deep/a")) << "the longer path";
    EXPECT_EQ("7 line 7", EntryOf("/v/a"));

    SetFile("/v 1\n");
    EXPECT_EQ("1 line 1", EntryOf("/v/a"));
    EXPECT_EQ("0 declared", EntryOf("/w/long/a"));
}

TEST_F(VolumeTableTest, NothingIsWrongWithAGoodFileOrNone) {
    EXPECT_EQ("", Fault());
    SetFile("");
    EXPECT_EQ("", Fault());
    SetFile("# volumes\n\n/v 1\n/v 2\n  /w\t xattr");
    EXPECT_EQ("", Fault());
    EXPECT_THAT(TakeSyslog(), IsEmpty());
}

TEST_F(VolumeTableTest, WhereTheTableCannotBeThereNothingIsWrong) {
    WriteFile(file_, {});
    const std::string below = file_ + "/volumes";
    VolumeTable table(below.c_str());
    EXPECT_EQ(0, table.Check().error);
    EXPECT_THAT(TakeSyslog(), IsEmpty());
}

TEST_F(VolumeTableTest, TheFirstMalformedLineIsWhatIsWrong) {
    using namespace std::string_view_literals;
    SetFile("relative 1\n/v 1\n");
    EXPECT_EQ("1: does not begin with an absolute path", Fault());
    SetFile("# volumes\n\n/no-type\n/typo eadri\n/v 1\n");
    EXPECT_EQ("3: has no type", Fault());
    SetFile("/v 1\n/w 13\n");
    EXPECT_EQ("2: does not end in a volume type", Fault());
    SetFile("/v 1\n/a\0b 1"sv);
    EXPECT_EQ("2: holds a NUL", Fault());
    EXPECT_EQ(1, table_.Find("/v")) << "the others count as ever";
    EXPECT_EQ("2: holds a NUL", Fault());
    EXPECT_EQ(5u, TakeSyslog().size()) << "each line once";
}

TEST_F(VolumeTableTest, WhatIsWrongIsLookedForAgainWhenTheFileHasChanged) {
    SetFile("/v 1\nbad\n");
    EXPECT_EQ(1, table_.Find("/v"));
    EXPECT_EQ("2: does not begin with an absolute path", Fault());
    EXPECT_EQ(1u, TakeSyslog().size()) << "what the last load found is told";
    SetFile("/v 1\n");
    EXPECT_EQ("", Fault());
    SetFile("/v x\n");
    EXPECT_EQ("1: does not end in a volume type", Fault());
    ASSERT_EQ(0, unlink(file_.c_str()));
    EXPECT_EQ("", Fault());
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
    EXPECT_EQ("cannot be read: ENXIO", Fault());
    EXPECT_THAT(TakeSyslog(), ElementsAre(StartsWith("<4>" + file_ + " cannot be read: ")));

    ASSERT_EQ(0, unlink(file_.c_str()));
    ASSERT_EQ(0, mkdir(file_.c_str(), 0700));
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_EQ(-1, table_.Find("/v"));
    EXPECT_EQ("cannot be read: EISDIR", Fault());
    EXPECT_THAT(TakeSyslog(), ElementsAre(HasSubstr("cannot be read")));
}

TEST_F(VolumeTableTest, AFileThatMayNotBeReadIsReportedOnce) {
    SetFile("/v 1\n");
    ASSERT_EQ(0, chmod(file_.c_str(), 0600));
    int type;
    std::string fault;
    {
        const test::AsNobody nobody;
        if (!nobody.ok()) GTEST_SKIP() << "needs the superuser";
        table_.Find("/v");
        type = table_.Find("/v");
        fault = Fault();
    }
    EXPECT_EQ(-1, type);
    EXPECT_EQ("cannot be read: EACCES", fault);
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

TEST_F(VolumeTableTest, OutOfMemoryACheckSaysSoAndTheNextOneLooksAgain) {
    SetFile("/old 1\n");
    EXPECT_EQ("", Fault());
    SetFile("/new 2\nbad\n");
    for (int nth = 1; nth <= 2; ++nth) {
        VolumeTable::Fault fault;
        {
            const test::FailNthAllocation failure(nth);
            fault = table_.Check();
        }
        EXPECT_EQ(ENOMEM, fault.error) << nth;
        EXPECT_EQ(0, fault.line) << nth;
    }
    EXPECT_EQ("2: does not begin with an absolute path", Fault());
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
                const VolumeTable::Fault fault = table_.Check();
                EXPECT_EQ(0, fault.error);
                EXPECT_STREQ(fault.line == 2 ? "has no type" : nullptr, fault.problem);
                EXPECT_TRUE(table_.Declare("/t/" + std::to_string(t) + "/" + std::to_string(i), 3));
            }
        });
    }
    for (int i = 0; i < 50; ++i) SetFile(i % 2 == 0 ? "/v 2\n" : "/v 1\n/w\n");
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(3, table_.Find("/t/3/199"));
}

// The process's table, with an /etc that no other process sees.
class ProcessVolumeTableTest : public ::testing::Test {
 protected:
    void SetUp() override {
        if (!etc_.ok()) GTEST_SKIP() << "needs the superuser, to mount a filesystem on /etc";
        ASSERT_EQ(0, mkdir("/etc/mavoea", 0755));
        TakeSyslog();
    }
    ~ProcessVolumeTableTest() override { ProcessVolumeTable().Clear(); }

    // What MAVOVolumeTableCheck() says, as "LINE: PROBLEM", an error's name, or nothing.
    static std::string Check() {
        int line = -2;
        const char* problem = "as it was";
        errno = ERANGE;
        const int result = MAVOVolumeTableCheck(&line, &problem);
        if (result == 1) {
            EXPECT_EQ(ERANGE, errno);
            return std::to_string(line) + ": " + problem;
        }
        EXPECT_EQ(-2, line);
        EXPECT_STREQ("as it was", problem);
        if (result == -1) return strerrorname_np(errno);
        EXPECT_EQ(0, result);
        EXPECT_EQ(ERANGE, errno);
        return "";
    }

    const test::PrivateMount etc_{"/etc", "tmpfs"};
};

TEST_F(ProcessVolumeTableTest, TheEntryThatDecidesIsTold) {
    WriteFile(MAVO_VOLUME_TABLE, Ascii("# volumes\n/proc/sys 2\n/listed 3\n"));
    ASSERT_EQ(0, MAVOVolumeDeclare("/listed", 7));
    const struct {
        const char* path;
        MAVOVolumeEntry entry;
    } kKnown[] = {{"/proc/sys", {2, MAVO_VOLUME_LISTED, 2}},
                  {"//proc/./x/../sys/none/", {2, MAVO_VOLUME_LISTED, 2}},
                  {"/listed/a", {7, MAVO_VOLUME_DECLARED, 0}}};
    for (const auto& [path, expected] : kKnown) {
        SCOPED_TRACE(path);
        MAVOVolumeEntry entry = {-2, -2, -2};
        errno = ERANGE;
        EXPECT_EQ(1, MAVOVolumeFind(path, &entry));
        EXPECT_EQ(ERANGE, errno);
        EXPECT_THAT(entry, FieldsAre(expected.type, expected.source, expected.line));
        EXPECT_EQ(expected.type, MAVOGetFSType(path, 1));
    }
    MAVOVolumeEntry entry = {-2, -2, -2};
    errno = ERANGE;
    EXPECT_EQ(0, MAVOVolumeFind("/", &entry));
    EXPECT_EQ(0, MAVOVolumeFind("/proc", &entry)) << "the filesystem is not asked";
    EXPECT_EQ(0, MAVOVolumeFind("/proc/system", &entry));
    EXPECT_EQ(ERANGE, errno);
    EXPECT_THAT(entry, FieldsAre(-2, -2, -2));
}

TEST_F(ProcessVolumeTableTest, WhatIsWrongWithTheFileIsTold) {
    EXPECT_EQ("", Check());
    WriteFile(MAVO_VOLUME_TABLE, Ascii("/v 1\n\n/w\nbad\n"));
    EXPECT_EQ("3: has no type", Check());
    WriteFile(MAVO_VOLUME_TABLE, Ascii("/v 1\n"));
    EXPECT_EQ("", Check());
    ASSERT_EQ(0, unlink(MAVO_VOLUME_TABLE));
    ASSERT_EQ(0, mkdir(MAVO_VOLUME_TABLE, 0755));
    EXPECT_EQ("EISDIR", Check());
    ASSERT_EQ(0, rmdir(MAVO_VOLUME_TABLE));
    EXPECT_EQ("", Check());
    ASSERT_EQ(0, rmdir("/etc/mavoea"));
    WriteFile("/etc/mavoea", {});
    EXPECT_EQ("", Check()) << "no directory for it either";
}

TEST(VolumeFindTest, WhatIsNotAnAbsolutePathIsRefused) {
    MAVOVolumeEntry entry = {-2, -2, -2};
    for (const char* path : {static_cast<const char*>(nullptr), "", "a", "./a"}) {
        errno = 0;
        EXPECT_EQ(-1, MAVOVolumeFind(path, &entry));
        EXPECT_EQ(EINVAL, errno);
    }
    errno = 0;
    EXPECT_EQ(-1, MAVOVolumeFind("/a", nullptr));
    EXPECT_EQ(EINVAL, errno);
    const std::string path(5000, '/');
    int result;
    {
        const test::FailNthAllocation failure(1);
        errno = 0;
        result = MAVOVolumeFind(path.c_str(), &entry);
    }
    EXPECT_EQ(-1, result);
    EXPECT_EQ(ENOMEM, errno);
    EXPECT_THAT(entry, FieldsAre(-2, -2, -2));
}

TEST(VolumeTableCheckTest, ArgumentsThatAreMissingAreRefused) {
    int line = -2;
    const char* problem = nullptr;
    errno = 0;
    EXPECT_EQ(-1, MAVOVolumeTableCheck(nullptr, &problem));
    EXPECT_EQ(EINVAL, errno);
    errno = 0;
    EXPECT_EQ(-1, MAVOVolumeTableCheck(&line, nullptr));
    EXPECT_EQ(EINVAL, errno);
}

TEST(VolumeTypeFromNameTest, NumbersFrom0To12AndTenNamesAreTypes) {
    for (int type = 0; type <= 12; ++type) {
        EXPECT_EQ(type, MAVOVolumeTypeFromName(std::to_string(type).c_str()));
    }
    EXPECT_EQ(0, MAVOVolumeTypeFromName("appledouble"));
    EXPECT_EQ(1, MAVOVolumeTypeFromName("eadir"));
    EXPECT_EQ(2, MAVOVolumeTypeFromName("fileea"));
    EXPECT_EQ(7, MAVOVolumeTypeFromName("xattr"));
    EXPECT_EQ(100, MAVOVolumeTypeFromName("samba"));
    EXPECT_EQ(101, MAVOVolumeTypeFromName("samba-stream"));
    EXPECT_EQ(102, MAVOVolumeTypeFromName("netatalk"));
    EXPECT_EQ(103, MAVOVolumeTypeFromName("netatalk-samba"));
    EXPECT_EQ(104, MAVOVolumeTypeFromName("linux"));
    EXPECT_EQ(105, MAVOVolumeTypeFromName("samba-all-streams"));
    for (const char* none : {"", "13", "99", "100", "104", "-1", "+1", " 1", "1 ", "1x", "eadir2",
                             "EADir", "Samba", "samba-"}) {
        EXPECT_EQ(-1, MAVOVolumeTypeFromName(none)) << none;
    }
    EXPECT_EQ(-1, MAVOVolumeTypeFromName(nullptr));
}

}  // namespace
}  // namespace mavoea::core

// A dry run says what the command would do and changes nothing: not a byte, mode, attribute or
// time.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <functional>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/snapshot.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr int kXattr = 7;
constexpr int kFileEa = 2;
constexpr int kSamba = 20;

std::string NameOfType(int type) {
    switch (type) {
        case 0:
            return "appledouble";
        case 1:
            return "eadir";
        case kFileEa:
            return "fileea";
        case kXattr:
            return "xattr";
        default:
            return "samba";
    }
}

Bytes StreamOf(const std::string& value) {
    return StreamImage{.attributes = {{"user.colour", Ascii(value)}}, .fork = Ascii("fork")}
        .Build();
}

class DryRunTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
        MakeDir(top());
        Put("a");
        Put("b");
        MakeDir(top() + "/inner");
        Put("inner/c");
        SetOldTimes(top());
    }

    std::string top() const { return dir_ / "share"; }
    std::string operator/(const std::string& name) const { return top() + '/' + name; }

    void Put(const std::string& name) const {
        WriteFile(*this / name, Ascii("data of " + name));
        chmod((*this / name).c_str(), 0644);
    }

    ToolResult Run(Arguments arguments, const std::string& input = {}) const {
        arguments.insert(arguments.begin(), {"--volume", top() + "=" + NameOfType(GetParam())});
        return RunTool(arguments, input);
    }

    bool HasEaDirectory() const { return GetParam() == 1 || GetParam() == kFileEa; }

    // The same words, status and failures as of the real run with --verbose, which comes next; and
    // nothing has changed when it does.
    void ExpectForeseen(const Arguments& arguments, const std::string& lines, int status = 0,
                        const std::string& input = {}) {
        const ToolResult said = ExpectSame(arguments, input);
        EXPECT_EQ(lines, said.out);
        EXPECT_EQ(status, said.status) << said.err;
    }

    // For what has no lines of its own for a test; returns the dry run's.
    ToolResult ExpectSame(const Arguments& arguments, const std::string& input = {}) {
        SCOPED_TRACE(::testing::PrintToString(arguments));
        SetOldTimes(top());
        const Snapshot before = TakeSnapshot(top());
        Arguments dry = arguments;
        dry.insert(dry.begin() + 1, "--dry-run");
        const ToolResult said = Run(dry, input);
        EXPECT_THAT(Differences(before, TakeSnapshot(top())), IsEmpty());
        Arguments real = arguments;
        real.insert(real.begin() + 1, "--verbose");
        const ToolResult done = Run(real, input);
        EXPECT_EQ(done.out, said.out);
        EXPECT_EQ(done.err, said.err);
        EXPECT_EQ(done.status, said.status);
        return said;
    }

 private:
    TempDir dir_;
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, DryRunTest,
                         ::testing::ValuesIn(Types({0, 1, kFileEa, kXattr, kSamba})),
                         [](const auto& tested) { return NameOfType(tested.param); });

// ---- lock, unlock -------------------------------------------------------------------------------

TEST_P(DryRunTest, LockingIsForeseenObjectByObject) {
    ASSERT_EQ(0, symlink("a", (*this / "link").c_str()));
    ExpectForeseen({"lock", *this / "a"},
                   *this / "a: locked\n1 locked, 0 already locked, 0 failed\n");
    ExpectForeseen({"lock", "-r", top()}, top() + ": locked\n" + *this / "a: already locked\n" +
                                              *this / "b: locked\n" + *this / "inner: locked\n" +
                                              *this / "inner/c: locked\n" +
                                              "4 locked, 1 already locked, 0 failed\n");
    ExpectForeseen({"unlock", *this / "a", *this / "missing", *this / "b"},
                   *this / "a: unlocked\n" + *this / "b: unlocked\n" +
                       "2 unlocked, 0 already unlocked, 1 failed\n",
                   1);
}

// ---- set, remove, set-info ----------------------------------------------------------------------

TEST_P(DryRunTest, ValuesAreSetAndRemovedAsForeseen) {
    const std::string a = *this / "a";
    ExpectForeseen({"set", a, "user.colour", "blue"}, a + ": set \"user.colour\", 4 bytes\n");
    ExpectForeseen({"set", a, "user.colour"}, a + ": set \"user.colour\", 70 bytes\n", 0,
                   std::string(70, 'x'));
    ExpectForeseen({"set", a, "user.other", "1"}, a + ": set \"user.other\", 1 byte\n");
    ExpectForeseen({"remove", a, "user.colour"}, a + ": removed \"user.colour\"\n");
    ExpectForeseen({"remove", a, "user.colour"}, "", 1);
    EXPECT_EQ("user.other\n", Run({"list", a}).out);
}

TEST_P(DryRunTest, FinderInfoForkAndLockAreSetAndRemovedAsForeseen) {
    const std::string a = *this / "a";
    // Plain attributes of other names than "user.*" have no place on a Linux file system.
    const bool plain = GetParam() == kXattr;
    const std::string info = "TEXTttxt" + std::string(24, '\0');
    ExpectForeseen({"set", a, kFinderInfoName},
                   plain ? "" : a + ": set \"com.apple.FinderInfo\", 32 bytes\n", plain ? 2 : 0,
                   info);
    ExpectForeseen({"set", a, kFinderInfoName}, "", 2, "too short");
    ExpectForeseen({"remove", a, kFinderInfoName},
                   plain ? "" : a + ": removed \"com.apple.FinderInfo\"\n", plain ? 1 : 0);
    ExpectForeseen({"remove", a, kFinderInfoName}, "", 1);
    ExpectForeseen({"set", a, kForkName},
                   plain ? "" : a + ": set \"com.apple.ResourceFork\", 8 bytes\n", plain ? 2 : 0,
                   "the fork");
    ExpectForeseen({"remove", a, kForkName},
                   plain ? "" : a + ": removed \"com.apple.ResourceFork\"\n", plain ? 1 : 0);
    ExpectForeseen({"set", a, kLockedName, "1"}, a + ": set \"mavoea.locked\", 1 byte\n");
    ExpectForeseen({"remove", a, kLockedName}, a + ": removed \"mavoea.locked\"\n");
}

TEST_P(DryRunTest, InfoIsSetAsForeseen) {
    if (GetParam() == kXattr) {
        return ExpectForeseen({"set-info", *this / "a", "--type", "TEXT"}, "", 2);
    }
    const std::string a = *this / "a";
    const ToolResult first = Run({"set-info", "-v", *this / "b", "--type", "TEXT", "--tags",
                                  "Home:red", "--comment", "hello"});
    ASSERT_EQ(0, first.status);
    const std::string same = ": " + first.out.substr((*this / "b: ").size());
    EXPECT_THAT(same, HasSubstr("com.apple.FinderInfo"));
    const Arguments change = {"--type", "TEXT", "--tags", "Home:red", "--comment", "hello"};
    Arguments words = {"set-info", a, *this / "missing", *this / "inner/c"};
    words.insert(words.end(), change.begin(), change.end());
    ExpectForeseen(words, a + same + *this / "inner/c" + same, 1);
    ExpectForeseen({"set-info", a, "--type", "TEXT"}, a + ": nothing to change\n");
    ExpectForeseen({"set-info", *this / "inner", "--type", "TEXT"}, "", 2);
    // A "._" file of a volume has no place for dates.
    EXPECT_EQ(GetParam() == 0 ? 2 : 0, ExpectSame({"set-info", a, "--type", "ABCD", "--comment",
                                                   "other", "--created", "2024-05-01T09:30:00Z"})
                                           .status);
    EXPECT_EQ(0,
              ExpectSame({"set-info", a, "--tags", "", "--comment", "", "--label", "blue"}).status);
}

// ---- upgrade, repair ----------------------------------------------------------------------------

TEST_P(DryRunTest, UpgradesAreForeseenObjectByObject) {
    if (!HasEaDirectory()) {
        ExpectForeseen({"upgrade", *this / "a"},
                       "0 converted, 0 already current, 0 with nothing to "
                       "convert, 1 failed\n",
                       2);
        return;
    }
    PutAppleDouble(*this / "a", AllMacFiles()[0].bytes);
    PutLegacy(*this / "b", "colour", Ascii("blue"));
    PutStream(*this / "inner/c", StreamOf("red"));
    Put("inner/damaged");
    PutLegacy(*this / "inner/damaged", "colour", Ascii("red"));
    MakeDir(*this / "inner/@eaDir/damaged/folder");
    Put("inner/left");
    PutStream(*this / "inner/left", StreamOf("red"));
    PutLegacy(*this / "inner/left", "colour", Ascii("blue"));
    ExpectForeseen({"upgrade", "-r", top()},
                   top() + ": nothing to convert\n" + *this / "a: converted\n" +
                       *this / "b: converted\n" + *this / "inner: nothing to convert\n" +
                       *this / "inner/c: already current\n" +
                       *this / "inner/left: already current\n" +
                       "2 converted, 2 already current, 2 with nothing to convert, 1 failed\n",
                   2);
}

TEST_P(DryRunTest, ValuesOfEarlierVersionsAreRemovedAsForeseen) {
    if (!HasEaDirectory()) return;
    const std::string a = *this / "a";
    PutLegacy(a, "colour", Ascii("blue"));
    ExpectForeseen({"remove", a, "shape"}, "", 1);
    PutLegacy(*this / "b", "colour", Ascii("blue"));
    ExpectForeseen({"remove", *this / "b", "colour"}, *this / "b: removed \"colour\"\n");
}

TEST_P(DryRunTest, RepairsAreForeseenObjectByObject) {
    if (!HasEaDirectory()) return;
    PutResource(*this / "a", StreamOf("blue"));
    PutResource(*this / "inner/c", Ascii("no AppleDouble file"));
    ExpectForeseen({"repair", "-r", top()},
                   top() + ": nothing to repair\n" + *this / "a: repaired\n" +
                       *this / "b: nothing to repair\n" + *this / "inner: nothing to repair\n" +
                       "1 repaired, 3 with nothing to repair, 1 failed\n",
                   2);
}

// ---- rm -----------------------------------------------------------------------------------------

TEST_P(DryRunTest, RemovalsAreForeseenObjectByObject) {
    const std::string a = *this / "a";
    const std::string inner = *this / "inner";
    ASSERT_EQ(0, Run({"set", *this / "inner/c", "user.colour", "blue"}).status);
    MakeDir(inner + "/empty");
    Put("single");
    ExpectForeseen({"rm", *this / "single"}, "removed '" + *this / "single'\n");
    const std::string removed = "removed '" + inner + "/c'\nremoved directory '" + inner +
                                "/empty'\nremoved directory '" + inner + "'\n";
    const ToolResult list = Run({"rm", "-r", "--dry-run", inner});
    EXPECT_THAT(list.out, HasSubstr("removed directory '" + inner + "'\n"));
    EXPECT_EQ(removed.size() + std::string("4 removed, 0 failed\n").size(), list.out.size());
    // What has gone before, by itself or with a directory above it, is missing.
    ExpectForeseen(
        {"rm", "-r", a, inner, inner + "/c", a},
        "removed '" + a + "'\n" + list.out.substr(0, removed.size()) + "4 removed, 2 failed\n", 1);
    EXPECT_FALSE(Exists(a));
    EXPECT_FALSE(Exists(inner));
}

TEST_P(DryRunTest, DirectoriesInWhichSomethingStaysAreForeseenToStay) {
    const std::string inner = *this / "inner";
    WriteFile(inner + "/._gone", Ascii("of no object"));
    ExpectForeseen({"rm", *this / "inner", *this / "a"},
                   "removed '" + *this / "a'\n1 removed, 1 failed\n", 1);
    ExpectSame({"rm", "-r", inner});
}

TEST_P(DryRunTest, NothingIsAsked) {
    const std::string a = *this / "a";
    const ToolResult said = Run({"rm", "-i", "--dry-run", a});
    EXPECT_THAT(said, Succeeded());
    EXPECT_EQ("removed '" + a + "'\n", said.out);
    EXPECT_TRUE(Exists(a));
}

// ---- import, restore ----------------------------------------------------------------------------

Bytes MacFileOf(const std::string& colour) {
    return StreamImage{.attributes = {{"user.colour", Ascii(colour)}}, .fork = {}}.Build();
}

TEST_P(DryRunTest, AnImportIsForeseen) {
    const std::string a = *this / "a";
    WriteFile(*this / "file", MacFileOf("blue"));
    ExpectForeseen({"import", *this / "file", a}, a + ": 1 attribute\n");
    EXPECT_EQ("user.colour\n", Run({"list", a}).out);
    for (const MacFile& file : AllMacFiles()) {
        SCOPED_TRACE(file.layout);
        WriteFile(*this / "file", file.bytes);
        ExpectSame({"import", *this / "file", a});
        ExpectSame({"import", *this / "file", *this / "inner"});
    }
    ExpectForeseen({"import", a, a}, "", 2);
    ExpectForeseen({"import", *this / "file", *this / "missing"}, "", 1);
}

TEST_P(DryRunTest, AnImportOfDataIsForeseen) {
    const std::string a = *this / "a";
    const std::string archive = *this / "archive";
    ASSERT_EQ(0, Run({"export", "--format", "applesingle", a, archive}).status);
    ExpectForeseen({"import", archive, *this / "new"}, *this / "new: data of 9 bytes\n");
    ExpectForeseen({"import", archive, *this / "new"}, *this / "new: nothing to take over\n");
    ExpectForeseen({"import", archive, *this / "b"}, "", 2);
    ExpectForeseen({"import", "--data", archive, *this / "b"}, *this / "b: data of 9 bytes\n");
    EXPECT_EQ(Ascii("data of a"), ReadFile(*this / "b"));
}

TEST_P(DryRunTest, AnImportOfATreeIsForeseenFileByFile) {
    const std::string folder = *this / "__MACOSX";
    MakeDir(folder);
    MakeDir(folder + "/inner");
    WriteFile(*this / "._a", MacFileOf("blue"));
    WriteFile(folder + "/._b", MacFileOf("red"));
    WriteFile(*this / "inner/._c", MacFileOf("green"));
    WriteFile(folder + "/inner/._c", MacFileOf("grey"));
    WriteFile(*this / "inner/._gone", MacFileOf("blue"));
    WriteFile(*this / "inner/._inner", Ascii("no AppleDouble file"));
    const ToolResult said = ExpectSame({"import", "-r", top()});
    EXPECT_THAT(said.out, HasSubstr(folder + "/._b: imported\n"));
    EXPECT_EQ(2, said.status);
    EXPECT_EQ(GetParam() == 0, Exists(*this / "._a"));
    EXPECT_FALSE(Exists(folder));
    ExpectSame({"import", "-r", top()});
}

TEST_P(DryRunTest, ARestoreIsForeseenObjectByObject) {
    const std::string text =
        "# file: a\nuser.user.colour=\"blue\"\n\n# file: inner/c\n"
        "user.user.colour=\"red\"\n\n# file: missing\nuser.user.colour=\"red\"\n\n";
    ExpectForeseen({"restore", "--directory", top()},
                   "'" + *this / "a'\n'" + *this / "inner/c'\n2 restored, 1 failed\n", 2, text);
    EXPECT_EQ("user.colour\n", Run({"list", *this / "inner/c"}).out);
    std::string saved;
    for (const MacFile& file : AllMacFiles()) {
        WriteFile(*this / "file", file.bytes);
        Put("source");
        EXPECT_NE(-1, Run({"import", *this / "file", *this / "source"}).status);
        saved = Run({"save", *this / "source"}).out;
        ASSERT_EQ(0, Run({"rm", *this / "source"}).status);
        Put("source");
        ExpectSame({"restore", "--directory", "/", "--absolute-names"}, saved);
    }
}

// ---- carry --------------------------------------------------------------------------------------

TEST_P(DryRunTest, WhatIsCarriedIsForeseenObjectByObject) {
    const std::string from = *this / "inner";
    const std::string to = *this / "copy";
    MakeDir(from + "/deep");
    for (const char* const name : {"/c", "/d", "/deep/e", "/missing", "/other"}) {
        WriteFile(from + name, Ascii("data"));
    }
    MakeDir(to);
    MakeDir(to + "/deep");
    MakeDir(to + "/other");
    for (const char* const name : {"/c", "/d", "/deep/e"}) WriteFile(to + name, Ascii("data"));
    ASSERT_EQ(0, Run({"set", from + "/c", "user.colour", "blue"}).status);
    ASSERT_EQ(0, Run({"set", to + "/c", "user.other", "red"}).status);
    ASSERT_EQ(0, Run({"set", from + "/deep", "user.colour", "blue"}).status);
    ASSERT_EQ(0, Run({"lock", from + "/deep/e"}).status);
    const ToolResult said = ExpectSame({"carry", "-r", from, to});
    EXPECT_THAT(said.out, HasSubstr("'" + from + "/c' -> '" + to + "/c'\n"));
    EXPECT_THAT(said.out, HasSubstr("5 carried, 2 failed\n"));
    EXPECT_EQ("user.colour\n", Run({"list", to + "/c"}).out);
    for (const MacFile& file : AllMacFiles()) {
        SCOPED_TRACE(file.layout);
        WriteFile(*this / "file", file.bytes);
        (void)Run({"import", *this / "file", from + "/d"});
        ExpectSame({"carry", from + "/d", to + "/d"});
        ExpectSame({"carry", from + "/d", to + "/d"});
    }
}

// ---- export, salvage ----------------------------------------------------------------------------

TEST_P(DryRunTest, AnExportIsForeseen) {
    const std::string a = *this / "a";
    const std::string file = *this / "new";
    ASSERT_EQ(0, Run({"set", a, "user.colour", "blue"}).status);
    ExpectForeseen({"export", a, file}, a + ": exported to " + file + "\n");
    EXPECT_TRUE(Exists(file));
    ExpectForeseen({"export", a, file}, "", 2);
    ExpectForeseen({"export", "--force", a, file}, a + ": exported to " + file + "\n");
    // It has no place for named attributes.
    const std::string binary = *this / "binary";
    ExpectForeseen({"export", "--format", "macbinary", a, binary},
                   a + ": exported to " + binary + "\n", 2);
    EXPECT_EQ("", Run({"export", "--dry-run", a, "-"}).out);
}

TEST_P(DryRunTest, ASalvageIsForeseenFileByFile) {
    const std::string a = *this / "a";
    const std::string directory = *this / "salvaged";
    ExpectForeseen({"salvage", a, directory}, "", 1);
    ASSERT_EQ(0, Run({"set", a, "user.colour", "blue"}).status);
    ExpectForeseen({"salvage", a, directory}, a + ": \"user.colour\" into attribute.user.colour\n");
    EXPECT_EQ(Ascii("blue"), ReadFile(directory + "/attribute.user.colour"));
    ExpectForeseen({"salvage", a, directory}, "", 2);
    if (GetParam() == kXattr || GetParam() == kSamba) return;
    const Bytes whole = StreamOf("blue");
    (GetParam() == 0 ? PutAppleDouble : PutStream)(a, Bytes(whole.begin(), whole.end() - 2));
    EXPECT_EQ(2, ExpectSame({"salvage", a, *this / "second"}).status);
}

// ---- What is known before -----------------------------------------------------------------------

TEST_P(DryRunTest, WhatAnotherUserMayNotDoIsForeseen) {
    const std::string a = *this / "a";
    chmod(top().c_str(), 0755);
    chmod(std::filesystem::path(top()).parent_path().c_str(), 0755);
    const Snapshot before = TakeSnapshot(top());
    for (const Arguments& words :
         std::vector<Arguments>{{"lock", a}, {"set", a, "user.colour", "blue"}}) {
        Arguments declared = {"--volume", top() + "=" + NameOfType(GetParam())};
        declared.insert(declared.end(), words.begin(), words.end());
        const ToolResult real = RunTool(declared, {}, {.user = 54321});
        declared.emplace_back("--dry-run");
        const ToolResult dry = RunTool(declared, {}, {.user = 54321});
        EXPECT_EQ(2, dry.status);
        EXPECT_EQ(real.status, dry.status);
        EXPECT_EQ(real.err, dry.err);
    }
    EXPECT_THAT(Differences(before, TakeSnapshot(top())), IsEmpty());
}

}  // namespace
}  // namespace mavoea::test

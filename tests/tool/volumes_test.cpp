// What decides the kind of a volume: the option, the table under /etc, the file system; and volumes
// that are mounted for reading only.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <filesystem>
#include <sstream>

#include "tests/platform/support/private_mounts.h"
#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::ContainsRegex;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;
using ::testing::UnorderedElementsAreArray;

constexpr char kTable[] = "/etc/mavoea/volumes";

// Matches standard error of one line, "mavoea: SUBJECT: ...CAUSE...; advice".
auto OneLine(const std::string& subject, const std::string& cause) {
    return AllOf(StartsWith("mavoea: " + subject + ": "), HasSubstr(cause),
                 ContainsRegex("; [^\n]+\n$"), Not(ContainsRegex("\n.")));
}

// ---- The option ---------------------------------------------------------------------------------

// An object whose metadata would show if a command ran.
class VolumeOptionTest : public ::testing::Test {
 protected:
    // `set` with that option and a good one.
    ToolResult SetWith(const std::string& option) const {
        return volume_.Run({"--volume", option, "set", volume_.object(), "a", "x"});
    }
    void ExpectNothingHappened(const ToolResult& result) const {
        EXPECT_EQ(2, result.status);
        EXPECT_EQ("", result.out);
        EXPECT_THAT(NamesIn(volume_.path()), ElementsAre("file.txt"));
    }

    const Volume volume_{0};
};

TEST_F(VolumeOptionTest, APathThatIsNotThereIsRefusedBeforeAnythingIsDone) {
    for (const std::string& path : {volume_.path() + "/none", volume_.path() + "/none/below",
                                    volume_.object() + "/below", volume_.path() + " "}) {
        SCOPED_TRACE(path);
        const ToolResult result = SetWith(path + "=1");
        ExpectNothingHappened(result);
        EXPECT_THAT(result.err, OneLine("--volume " + path + "=1", ""));
    }
    EXPECT_THAT(SetWith(volume_.path() + "/none=1").err, HasSubstr("No such file or directory"));
}

TEST_F(VolumeOptionTest, APathThatIsNoDirectoryIsRefused) {
    const ToolResult result = SetWith(volume_.object() + "=0");
    ExpectNothingHappened(result);
    EXPECT_THAT(result.err,
                OneLine("--volume " + volume_.object() + "=0", "it is not a directory"));
}

TEST_F(VolumeOptionTest, APathThatMayNotBeLookedAtIsRefused) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    const TempDir closed;
    ASSERT_EQ(0, mkdir((closed / "below").c_str(), 0755));
    ASSERT_EQ(0, chmod(closed.path().c_str(), 0700));
    ASSERT_EQ(0, chmod(volume_.path().c_str(), 0777));
    AsUser(1234, Root::kGivenUp, [&] {
        const ToolResult result = SetWith(closed / "below" + "=1");
        ExpectNothingHappened(result);
        EXPECT_THAT(result.err,
                    OneLine("--volume " + closed / "below" + "=1", "Permission denied"));
    });
}

TEST_F(VolumeOptionTest, ATypeThatIsNoneIsRefused) {
    for (const std::string type : {"13", "-1", "ext5", "EADIR", "1 ", ""}) {
        SCOPED_TRACE(type);
        const std::string option = volume_.path() + "=" + type;
        const ToolResult result = SetWith(option);
        ExpectNothingHappened(result);
        EXPECT_THAT(result.err, OneLine("--volume " + option, "\"" + type + "\""));
    }
}

TEST_F(VolumeOptionTest, OneBadOptionAmongGoodOnesIsEnoughAndEveryCommandLooks) {
    const std::string bad = volume_.path() + "/none=1";
    const std::string& object = volume_.object();
    for (const Arguments& command : std::vector<Arguments>{{"where", object},
                                                           {"list", object},
                                                           {"get", object, "a"},
                                                           {"cp", object, object + "2"},
                                                           {"rm", object},
                                                           {"dump", object}}) {
        SCOPED_TRACE(command.front());
        Arguments arguments = {"--volume", "/=1", "--volume", bad, "--volume", "/tmp=1"};
        arguments.insert(arguments.end(), command.begin(), command.end());
        const ToolResult result = RunTool(arguments);
        ExpectNothingHappened(result);
        EXPECT_THAT(result.err, OneLine("--volume " + bad, "No such file or directory"));
    }
}

// ---- The table ----------------------------------------------------------------------------------

// An /etc that no other process sees, with a table of the test's own.
class VolumeTableTest : public ::testing::Test {
 protected:
    void SetUp() override {
        if (!etc_.ok()) GTEST_SKIP() << "needs the superuser, to mount a file system on /etc";
        // This one has a type, whatever temporary files lie on.
        ASSERT_TRUE(room_.ok());
        ASSERT_EQ(0, mkdir("/etc/mavoea", 0755));
        ASSERT_EQ(0, mkdir(dir().c_str(), 0755));
        ASSERT_EQ(0, mkdir((dir() + "/sub").c_str(), 0755));
        WriteFile(object(), Ascii("data"));
    }

    std::string dir() const { return point_ / "dir"; }
    std::string object() const { return dir() + "/sub/file"; }

    static void SetTable(const std::string& text) { WriteFile(kTable, Ascii(text)); }

    // The line of `where` about the type.
    std::string TypeLine(Arguments options = {}) const {
        options.insert(options.end(), {"where", object()});
        const ToolResult where = RunTool(options);
        EXPECT_THAT(where, Succeeded());
        const std::string begin = object() + "\n";
        EXPECT_THAT(where.out, StartsWith(begin));
        return where.out.substr(begin.size(), where.out.find('\n', begin.size()) - begin.size());
    }

    // Commands of every kind. Each of them would do something, or say it.
    std::vector<Arguments> EveryCommand() const {
        const std::string& path = object();
        return {{"where", path},
                {"list", path},
                {"get", path, "a"},
                {"set", path, "a", "x"},
                {"remove", path, "a"},
                {"cp", path, dir() + "/copy"},
                {"mv", path, dir() + "/moved"},
                {"rm", path},
                {"convert", "--to", "1", path, dir() + "/converted"},
                {"clean", dir()},
                {"check", path},
                {"lock", path},
                {"unlock", path},
                {"import", path, path},
                {"upgrade", path},
                {"repair", path},
                {"dump", path},
                {"dump", "--record", path}};
    }

    // Runs every command, which must end with a line that `matches`, and do nothing.
    template <class Matcher>
    void ExpectEveryCommandToEndWith(const Matcher& matches) const {
        for (const Arguments& command : EveryCommand()) {
            for (const bool json : {false, true}) {
                SCOPED_TRACE(command.front() + (json ? " --json" : ""));
                Arguments arguments = {"--volume", dir() + "=1"};
                if (json) arguments.push_back("--json");
                arguments.insert(arguments.end(), command.begin(), command.end());
                const ToolResult result = RunTool(arguments);
                EXPECT_EQ(2, result.status);
                EXPECT_EQ("", result.out);
                EXPECT_THAT(result.err, matches);
                ASSERT_THAT(NamesIn(dir()), ElementsAre("sub"));
                ASSERT_THAT(NamesIn(dir() + "/sub"), ElementsAre("file"));
                EXPECT_EQ(Ascii("data"), ReadFile(object()));
            }
        }
    }

    const TempDir point_;
    const PrivateMount room_{point_.path(), "tmpfs"};
    const PrivateMount etc_{"/etc", "tmpfs"};
};

TEST_F(VolumeTableTest, AMalformedLineEndsEveryCommandBeforeItDoesAnything) {
    SetTable("# volumes\n" + dir() + " 1\n/typo eadri\n/another\n");
    ExpectEveryCommandToEndWith(
        AllOf(OneLine(std::string(kTable) + ":3", "does not end in a volume type"),
              HasSubstr("; mend the line; for a type, take a number from 0 to 12, appledouble,")));
}

TEST_F(VolumeTableTest, EveryWayToBeMalformedIsTold) {
    using namespace std::string_literals;
    const struct {
        std::string line;
        std::string problem;
    } cases[] = {
        {"relative 1", "does not begin with an absolute path"},
        {"/no-type", "has no type"},
        {"/too-big 13", "does not end in a volume type"},
        {"/comment 1 # here", "does not end in a volume type"},
        {"/a\0b 1"s, "holds a NUL"},
    };
    for (const auto& [line, problem] : cases) {
        SCOPED_TRACE(line);
        SetTable(line);
        const ToolResult result = RunTool({"list", object()});
        EXPECT_EQ(2, result.status);
        EXPECT_EQ("", result.out);
        EXPECT_THAT(result.err, OneLine(std::string(kTable) + ":1", problem));
    }
}

TEST_F(VolumeTableTest, ATableThatCannotBeReadEndsEveryCommandToo) {
    ASSERT_EQ(0, mkdir(kTable, 0755));
    ExpectEveryCommandToEndWith(OneLine(kTable, "Is a directory"));
}

TEST_F(VolumeTableTest, ATableThatIsAPipeIsNotWaitedFor) {
    ASSERT_EQ(0, mkfifo(kTable, 0644));
    WithoutWaiting([&] {
        const ToolResult result = RunTool({"list", object()});
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, OneLine(kTable, ""));
    });
}

TEST_F(VolumeTableTest, ATableThatThisUserMayNotReadIsNoTableThatIsMissing) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    SetTable(dir() + " 7\n");
    ASSERT_EQ(0, chmod(kTable, 0600));
    ASSERT_EQ(0, chmod(point_.path().c_str(), 0755));
    AsUser(1234, Root::kGivenUp, [&] {
        const ToolResult result = RunTool({"where", object()});
        EXPECT_EQ(2, result.status);
        EXPECT_EQ("", result.out);
        EXPECT_THAT(result.err, OneLine(kTable, "Permission denied"));
    });
}

TEST_F(VolumeTableTest, AGoodTableOrNoneIsNoTrouble) {
    for (const bool there : {false, true}) {
        if (there) SetTable("# nothing but this\n\n" + dir() + "\t eadir \n");
        EXPECT_THAT(RunTool({"set", object(), "a", "x"}), Succeeded());
        EXPECT_EQ("x", RunTool({"get", object(), "a"}).out);
        EXPECT_THAT(RunTool({"list", object()}), Succeeded());
    }
}

// ---- Which of the three decided -----------------------------------------------------------------

TEST_F(VolumeTableTest, WhereSaysWhichOfTheThreeDecided) {
    EXPECT_EQ("  volume type: 1, EA directory (the filesystem)", TypeLine());
    SetTable("# volumes\n\n" + dir() + " appledouble\n");
    EXPECT_EQ("  volume type: 0, AppleDouble (/etc/mavoea/volumes, line 3)", TypeLine());
    EXPECT_EQ("  volume type: 2, file EA (--volume " + dir() + "/sub=2)",
              TypeLine({"--volume", dir() + "/sub=2"}));
}

TEST_F(VolumeTableTest, JsonHasTheTextBetweenTheParentheses) {
    const auto source = [&](Arguments options) {
        options.insert(options.end(), {"--json", "where", object()});
        const auto json = RunTool(options).json();
        return json["type"].dump() + " " + json["typeSource"].get<std::string>();
    };
    EXPECT_EQ("1 the filesystem", source({}));
    EXPECT_EQ("7 --volume " + dir() + "=7", source({"--volume", dir() + "=7"}));
    SetTable(dir() + " 0\n");
    EXPECT_EQ("0 /etc/mavoea/volumes, line 1", source({}));
}

TEST_F(VolumeTableTest, TheLongestEntryDecidesAndOfEqualOnesTheOption) {
    SetTable("/ 0\n" + dir() + " 1\n" + dir() + "/sub 2\n" + dir() + "/su 7\n");
    EXPECT_EQ("  volume type: 2, file EA (/etc/mavoea/volumes, line 3)", TypeLine());
    EXPECT_EQ("  volume type: 2, file EA (/etc/mavoea/volumes, line 3)",
              TypeLine({"--volume", dir() + "=7", "--volume", "/=5"}));
    EXPECT_EQ("  volume type: 7, extended attributes (--volume " + dir() + "/sub=7)",
              TypeLine({"--volume", dir() + "/sub=7", "--volume", dir() + "=0"}));

    SetTable(dir() + "/sub 1\n/ 0\n" + dir() + "/sub 2\n");
    EXPECT_EQ("  volume type: 2, file EA (/etc/mavoea/volumes, line 3)", TypeLine())
        << "the later of two lines";
    SetTable("/ 10\n");
    EXPECT_EQ("  volume type: 10, EA directory (/etc/mavoea/volumes, line 1)", TypeLine());
    EXPECT_EQ("  volume type: 5, AppleDouble (--volume /=5)", TypeLine({"--volume", "/=5"}));
}

TEST_F(VolumeTableTest, TheSameTypeFromTwoEntriesIsThatOfTheOneThatDecides) {
    SetTable(dir() + "/sub 1\n");
    EXPECT_EQ("  volume type: 1, EA directory (/etc/mavoea/volumes, line 1)",
              TypeLine({"--volume", dir() + "=1"}));
    EXPECT_EQ("  volume type: 1, EA directory (--volume " + dir() + "/sub=1)",
              TypeLine({"--volume", dir() + "/sub=1"}));
}

TEST_F(VolumeTableTest, TheOptionsDirectoryIsShownFromTheRoot) {
    fs::current_path(dir());
    EXPECT_EQ("  volume type: 7, extended attributes (--volume " + dir() + "/sub=7)",
              TypeLine({"--volume", "sub=7"}));
    EXPECT_EQ("  volume type: 7, extended attributes (--volume " + dir() + "=7)",
              TypeLine({"--volume", ".=7"}));
    fs::current_path("/");
}

// ---- Volumes for reading only -------------------------------------------------------------------

// A directory that is mounted once more, for reading only, at the end of Seal().
class ReadOnlyTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        if (!room_.ok()) GTEST_SKIP() << "needs the superuser, to mount a file system";
        WriteFile(object(), Ascii("data"));
    }

    std::string object() const { return point_ / "file"; }
    std::string folder() const { return point_ / "@eaDir/file"; }

    void Put(const std::string& path, const Bytes& bytes) const {
        fs::create_directories(fs::path(path).parent_path());
        WriteFile(path, bytes);
    }

    void Seal() const {
        ASSERT_EQ(0, mount(nullptr, point_.path().c_str(), nullptr,
                           MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr));
        ASSERT_EQ(-1, open((object() + "2").c_str(), O_WRONLY | O_CREAT, 0600));
        ASSERT_EQ(EROFS, errno);
    }

    ToolResult Run(Arguments arguments) const {
        arguments.insert(arguments.begin(),
                         {"--volume", point_.path() + "=" + std::to_string(GetParam())});
        return RunTool(arguments);
    }

    // That all that looks works, and finds those names.
    void ExpectNames(const std::vector<std::string>& names, const std::string& metadata) const {
        const ToolResult list = Run({"list", object()});
        EXPECT_THAT(list, Succeeded());
        std::istringstream lines(list.out);
        std::vector<std::string> listed;
        for (std::string line; std::getline(lines, line);) listed.push_back(line);
        EXPECT_THAT(listed, UnorderedElementsAreArray(names));
        const ToolResult details = Run({"list", "-l", object()});
        EXPECT_THAT(details, Succeeded());
        EXPECT_THAT(details.out, HasSubstr(point_.path()));
        EXPECT_THAT(Run({"--json", "list", object()}), Succeeded());
        EXPECT_THAT(Run({"where", object()}), Succeeded());
        EXPECT_THAT(Run({"dump", metadata}), Succeeded());
    }
    void ExpectValue(const std::string& name, const Bytes& value) const {
        const ToolResult get = Run({"get", object(), name});
        EXPECT_THAT(get, Succeeded()) << name;
        EXPECT_EQ(value, get.bytes()) << name;
    }

    const TempDir point_;
    const PrivateMount room_{point_.path(), "tmpfs"};
};
INSTANTIATE_TEST_SUITE_P(EaDirectoryKinds, ReadOnlyTest, ::testing::ValuesIn(Types({1, 2, 3})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(ReadOnlyTest, AttributeFilesOfALegacyFolderAreRead) {
    Put(folder() + "/colour", Ascii("blue"));
    Put(folder() + "/tags", Pattern(3000));
    Put(folder() + "/MAVO:Resource", PlainAppleDouble(Pattern(32, 1), Ascii("fork")));
    Seal();
    ExpectNames({"colour", "com.apple.FinderInfo", "com.apple.ResourceFork", "tags"},
                folder() + "/MAVO:Resource");
    ExpectValue("colour", Ascii("blue"));
    ExpectValue("tags", Pattern(3000));
    ExpectValue("com.apple.FinderInfo", Pattern(32, 1));
    ExpectValue("com.apple.ResourceFork", Ascii("fork"));
}

TEST_P(ReadOnlyTest, AnAppleDoubleFileWithoutAStreamIsRead) {
    const std::string apple_double = point_ / "._file";
    Put(apple_double, StreamImage{.attributes = {{"colour", Ascii("blue")}}}.Build());
    Seal();
    ExpectNames({"colour"}, apple_double);
    ExpectValue("colour", Ascii("blue"));
}

TEST_P(ReadOnlyTest, TheCurrentLayoutIsRead) {
    const std::string stream = point_ / "@eaDir/file@MavoEAStream";
    Put(stream, StreamImage{.attributes = {{"colour", Ascii("blue")}}}.Build());
    Put(point_ / "@eaDir/file@MavoResource", PlainAppleDouble(Pattern(32, 1), Ascii("fork")));
    Seal();
    ExpectNames({"colour", "com.apple.FinderInfo", "com.apple.ResourceFork"}, stream);
    ExpectValue("colour", Ascii("blue"));
    ExpectValue("com.apple.ResourceFork", Ascii("fork"));
}

TEST_P(ReadOnlyTest, AnObjectWithoutMetadataHasNone) {
    Seal();
    EXPECT_THAT(Run({"list", object()}), Succeeded());
    EXPECT_EQ("", Run({"list", object()}).out);
    EXPECT_EQ(1, Run({"get", object(), "colour"}).status);
    EXPECT_THAT(Run({"where", object()}), Succeeded());
}

TEST_P(ReadOnlyTest, WhatWouldChangeSomethingFailsAndSaysWhy) {
    Put(folder() + "/colour", Ascii("blue"));
    Seal();
    for (const Arguments& command : std::vector<Arguments>{{"set", object(), "a", "x"},
                                                           {"remove", object(), "colour"},
                                                           {"upgrade", object()},
                                                           {"rm", object()}}) {
        SCOPED_TRACE(command.front());
        const ToolResult result = Run(command);
        EXPECT_EQ(command.front() == "rm" ? 1 : 2, result.status);
        EXPECT_THAT(result.err, HasSubstr("Read-only file system"));
    }
    ExpectValue("colour", Ascii("blue"));
}

}  // namespace
}  // namespace mavoea::test

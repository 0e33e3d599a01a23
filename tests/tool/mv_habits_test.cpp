// mavoea mv has the options and habits of coreutils' mv, and metadata goes with the object in each.

#include <optional>

#include "tests/tool/habits.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

using MvHabitsTest = HabitsTest;
INSTANTIATE_TEST_SUITE_P(VolumeTypes, MvHabitsTest, ::testing::ValuesIn(Types({0, 1, 2, 7})),
                         TypeName);

// ---- Backups ------------------------------------------------------------------------------------

TEST_P(MvHabitsTest, ABackupKeepsTheMetadataOfWhatWasThere) {
    const struct {
        Arguments options;
        std::string backup;
    } cases[] = {
        {{"-b"}, "a~"},
        {{"--backup"}, "a~"},
        {{"--backup=simple"}, "a~"},
        {{"--backup=numbered"}, "a.~1~"},
        {{"--back=t"}, "a.~1~"},
        {{"-S", ".old"}, "a.old"},
        {{"-b", "--suff=.old"}, "a.old"},
    };
    for (const auto& [options, backup] : cases) {
        SCOPED_TRACE(::testing::PrintToString(options));
        Make("from/a", "new");
        Make("to/a", "old");
        Arguments arguments = {"mv", "-v", "from/a", "to"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        const ToolResult result = Run(arguments);
        EXPECT_THAT(result, Succeeded());
        EXPECT_EQ("renamed 'from/a' -> 'to/a' (backup: 'to/" + backup + "')\n", result.out);
        ExpectWhole("to/a", "new");
        ExpectWhole("to/" + backup, "old");
        EXPECT_THAT(Travel::ObjectsIn("from"), IsEmpty());
        EXPECT_THAT(Run({"rm", "to/a", "to/" + backup}), Succeeded());
    }
}

TEST_P(MvHabitsTest, ADirectoryHasABackupAsWell) {
    MakeDirectory("from/tree", "new");
    Make("from/tree/a", "a");
    MakeDirectory("to/tree", "old");
    Make("to/tree/b", "b");
    EXPECT_THAT(Run({"mv", "-b", "from/tree", "to"}), Succeeded());
    ExpectMetadata("to/tree", "new");
    ExpectWhole("to/tree/a", "a");
    ExpectMetadata("to/tree~", "old");
    ExpectWhole("to/tree~/b", "b");
    EXPECT_FALSE(Exists("to/tree/b"));
}

TEST_P(MvHabitsTest, ABackupDestroysNoSource) {
    Make("to/a~", "new");
    Make("to/a", "old");
    EXPECT_THAT(Run({"mv", "-b", "to/a~", "to/a"}),
                Failed(1,
                       "backing up 'to/a' might destroy source;  'to/a~' not moved; use "
                       "--backup=numbered"));
    ExpectWhole("to/a", "old");
    ExpectWhole("to/a~", "new");
}

// ---- What is there already ----------------------------------------------------------------------

TEST_P(MvHabitsTest, WithUOnlyWhatIsNewerMovesWithAllThatItHas) {
    for (const char* option : {"-u", "--update", "--up"}) {
        SCOPED_TRACE(option);
        Make("from/a", "new");
        Make("to/a", "old");
        SetTime("from/a", 1000000000);
        SetTime("to/a", 1000000000);
        EXPECT_THAT(Run({"mv", option, "from/a", "to"}), Succeeded());
        ExpectWhole("to/a", "old");
        ExpectWhole("from/a", "new");
        SetTime("from/a", 1000000001);
        EXPECT_THAT(Run({"mv", option, "from/a", "to"}), Succeeded());
        ExpectWhole("to/a", "new");
        EXPECT_FALSE(Exists("from/a"));
    }
}

TEST_P(MvHabitsTest, OfAskingForcingAndNeverTheLastCounts) {
    const auto moves = [&](const Arguments& options, const std::string& answer) {
        Make("from/a", "new");
        Make("to/a", "old");
        Arguments arguments = {"mv", "from/a", "to"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        EXPECT_EQ(0, Run(arguments, answer).status);
        const bool moved = !Exists("from/a");
        ExpectWhole("to/a", moved ? "new" : "old");
        if (!moved) ExpectWhole("from/a", "new");
        return moved;
    };
    EXPECT_TRUE(moves({}, "n\n"));
    EXPECT_FALSE(moves({"-i"}, "n\n"));
    EXPECT_TRUE(moves({"-i"}, "y\n"));
    EXPECT_FALSE(moves({"-n"}, ""));
    EXPECT_TRUE(moves({"-n", "-f"}, ""));
    EXPECT_TRUE(moves({"-i", "-f"}, "n\n"));
    EXPECT_FALSE(moves({"-f", "-i"}, "n\n"));
    EXPECT_FALSE(moves({"-f", "-n"}, "y\n"));
    EXPECT_FALSE(moves({"--force", "--no-cl"}, "y\n"));
    EXPECT_TRUE(moves({"-n", "--inter"}, "y\n"));
}

TEST_P(MvHabitsTest, OneFileIsNotMovedOntoItself) {
    Make("from/a", "a");
    ASSERT_EQ(0, link("from/a", "from/b"));
    ASSERT_EQ(0, symlink("a", "from/link"));
    const auto same = [](const std::string& from, const std::string& to) {
        return Failed(1, "'" + from + "' and '" + to +
                             "' are the same file; name another "
                             "destination");
    };
    EXPECT_THAT(Run({"mv", "from/a", "from/a"}), same("from/a", "from/a"));
    EXPECT_THAT(Run({"mv", "from/a", "from/b"}), same("from/a", "from/b"));
    EXPECT_THAT(Run({"mv", "from/link", "from/a"}), same("from/link", "from/a"));
    EXPECT_THAT(Run({"mv", "from/a", "from"}), same("from/a", "from/a"));
    EXPECT_THAT(Run({"mv", "-n", "from/a", "from/b"}), Succeeded());
    EXPECT_THAT(Travel::ObjectsIn("from"), ElementsAre("a", "b", "link"));
    ExpectWhole("from/a", "a");
}

TEST_P(MvHabitsTest, ALinkThatLeadsElsewhereReplacesAFileOfSeveralNames) {
    Make("from/a", "old");
    ASSERT_EQ(0, link("from/a", "from/b"));
    ASSERT_EQ(0, symlink("nowhere", "from/link"));
    EXPECT_THAT(Run({"mv", "from/link", "from/a"}), Succeeded());
    EXPECT_EQ("nowhere", fs::read_symlink("from/a"));
    EXPECT_EQ("data of old", TextOf("from/b"));
}

TEST_P(MvHabitsTest, ALinkAtTheDestinationIsReplacedAndNotFollowed) {
    Make("from/a", "new");
    Make("to/real", "real");
    ASSERT_EQ(0, symlink("real", "to/link"));
    EXPECT_THAT(Run({"mv", "-T", "from/a", "to/link"}), Succeeded());
    ExpectWhole("to/link", "new");
    EXPECT_FALSE(fs::is_symlink("to/link"));
    ExpectWhole("to/real", "real");
    MakeDirectory("to/dir", "dir");
    ASSERT_EQ(0, symlink("dir", "to/way"));
    Make("from/b", "b");
    EXPECT_THAT(Run({"mv", "from/b", "to/way"}), Succeeded());
    ExpectWhole("to/dir/b", "b");
}

TEST_P(MvHabitsTest, NothingJustMovedIsOverwritten) {
    Make("from/a", "first");
    ASSERT_EQ(0, mkdir("from/x", 0755));
    Make("from/x/a", "second");
    EXPECT_THAT(Run({"mv", "from/a", "from/x/a", "to"}),
                Failed(1,
                       "will not overwrite just-created 'to/a' with 'from/x/a'; give it another "
                       "name"));
    ExpectWhole("to/a", "first");
    ExpectWhole("from/x/a", "second");
}

// ---- Paths --------------------------------------------------------------------------------------

TEST_P(MvHabitsTest, ASlashAtTheEndMeansADirectory) {
    Make("from/a", "a");
    MakeDirectory("from/tree", "tree");
    ASSERT_EQ(0, symlink("tree", "from/link"));
    EXPECT_THAT(Run({"mv", "from/a/", "to"}),
                Failed(1, "cannot stat 'from/a/': Not a directory; check the path"));
    EXPECT_EQ(1, Run({"mv", "from/a", "to/none/"}).status);
    EXPECT_EQ(1, Run({"mv", "from/link/", "to"}).status);
    EXPECT_THAT(Run({"mv", "--strip-trailing-slashes", "from/link/", "from/a//", "to"}),
                Succeeded());
    EXPECT_TRUE(fs::is_symlink("to/link"));
    ExpectWhole("to/a", "a");
    EXPECT_THAT(Run({"mv", "from/tree/", "to/new/"}), Succeeded());
    ExpectMetadata("to/new", "tree");
    EXPECT_THAT(Travel::ObjectsIn("from"), IsEmpty());
}

TEST_P(MvHabitsTest, LinksBeforeDotsAreWhereTheyLead) {
    ASSERT_EQ(0, mkdir("from/deep", 0755));
    ASSERT_EQ(0, mkdir("from/deep/er", 0755));
    Make("from/deep/a", "there");
    Make("from/a", "here");
    ASSERT_EQ(0, symlink("deep/er", "from/link"));
    EXPECT_THAT(Run({"mv", "from/link/../a", "to"}), Succeeded());
    ExpectWhole("to/a", "there");
    ExpectWhole("from/a", "here");
    EXPECT_FALSE(Exists("from/deep/a"));
}

TEST_P(MvHabitsTest, DotAndDotDotAreNotMoved) {
    MakeDirectory("from/tree", "tree");
    Make("from/tree/a", "a");
    for (const char* source : {"from/tree/.", "from/tree/..", "."}) {
        SCOPED_TRACE(source);
        EXPECT_EQ(1, Run({"mv", source, "to"}).status);
    }
    ExpectWhole("from/tree/a", "a");
    EXPECT_THAT(Travel::ObjectsIn("to"), IsEmpty());
}

TEST_P(MvHabitsTest, NamesAreShownAsTheyWereTyped) {
    Make("from/a", "a");
    EXPECT_EQ("renamed 'from//./a' -> 'to/../to/a'\n",
              Run({"mv", "-v", "from//./a", "to/../to"}).out);
    EXPECT_THAT(Run({"mv", "from/../from/none", "to"}),
                Failed(1,
                       "cannot stat 'from/../from/none': No such file or directory; check the "
                       "path"));
}

TEST_P(MvHabitsTest, TheDestinationIsTheDirectoryOrTheObjectAsIsSaid) {
    MakeDirectory("from/tree", "tree");
    Make("from/a", "a");
    MakeDirectory("to/tree", "old");
    EXPECT_EQ(1, Run({"mv", "-t", "to", "-T", "from/a"}).status);
    EXPECT_THAT(Run({"mv", "--target-dir=to", "from/a"}), Succeeded());
    ExpectWhole("to/a", "a");
    EXPECT_THAT(Run({"mv", "-T", "from/tree", "to/tree"}), Succeeded());
    ExpectMetadata("to/tree", "tree");
    EXPECT_FALSE(Exists("to/tree/tree"));
}

// ---- To another file system ---------------------------------------------------------------------

class MvAcrossTest : public HabitsTest {
 protected:
    void SetUp() override {
        HabitsTest::SetUp();
        if (IsSkipped()) return;
        mounted_.emplace("to");
        if (!mounted_->ok()) GTEST_SKIP() << "takes the right to mount";
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("to");
    }

    std::optional<MountedHere> mounted_;
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, MvAcrossTest, ::testing::ValuesIn(Types({0, 1, 2, 7})),
                         TypeName);

TEST_P(MvAcrossTest, AllIsKeptThatTheObjectHas) {
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS("/tmp");
    Make("from/a", "a");
    ASSERT_EQ(0, link("from/a", "from/b"));
    if (type() != kXattr) Give("from/b", type() == kFileEa ? "a" : "b");
    ASSERT_EQ(0, chown("from/a", 1234, 4321));
    ASSERT_EQ(0, chmod("from/a", 0647));
    SetTime("from/a", 1000000000);
    EXPECT_THAT(Run({"mv", "from/a", "from/b", "to"}), Succeeded());
    EXPECT_THAT(Travel::ObjectsIn("from"), IsEmpty());
    const struct stat there = StatusOf("to/a");
    EXPECT_EQ(mode_t{0647}, there.st_mode & 07777);
    EXPECT_EQ(1234U, there.st_uid);
    EXPECT_EQ(4321U, there.st_gid);
    EXPECT_EQ(1000000000, there.st_mtim.tv_sec);
    EXPECT_EQ(InodeOf("to/a"), InodeOf("to/b"));
    ExpectWhole("to/a", "a");
    ExpectMetadata("to/b", type() == kAppleDouble || type() == kEaDirectory ? "b" : "a");
}

TEST_P(MvAcrossTest, BackupsNewerOnesAndQuestionsAreAsInARename) {
    Make("from/a", "new");
    Make("to/a", "old");
    SetTime("from/a", 1000000000);
    SetTime("to/a", 1000000001);
    EXPECT_THAT(Run({"mv", "-u", "from/a", "to"}), Succeeded());
    ExpectWhole("to/a", "old");
    EXPECT_EQ(0, Run({"mv", "-i", "from/a", "to"}, "n\n").status);
    ExpectWhole("to/a", "old");
    ExpectWhole("from/a", "new");
    EXPECT_THAT(Run({"mv", "-b", "from/a", "to"}), Succeeded());
    ExpectWhole("to/a", "new");
    ExpectWhole("to/a~", "old");
    EXPECT_FALSE(Exists("from/a"));
}

// In mv's own words.
TEST_P(MvAcrossTest, EachThatIsCopiedAndRemovedIsSaid) {
    Make("from/a", "new");
    Make("to/a", "old");
    EXPECT_EQ("copied 'from/a' -> 'to/a' (backup: 'to/a~')\nremoved 'from/a'\n",
              Run({"mv", "-v", "-b", "from/a", "to"}).out);
    ASSERT_EQ(0, mkdir("from/d", 0755));
    Make("from/d/x", "x");
    EXPECT_EQ(
        "created directory 'to/d'\ncopied 'from/d/x' -> 'to/d/x'\n"
        "removed 'from/d/x'\nremoved directory 'from/d'\n",
        Run({"mv", "-v", "from/d", "to"}).out);
    EXPECT_EQ("", Run({"mv", "to/d", "from"}).out);
}

TEST_P(MvAcrossTest, AnInterruptAndASecondRunBringAllOfIt) {
    for (const char* name : {"a", "b", "c"}) Make(std::string("from/") + name, name);
    Make("to/b", "old");
    const Arguments command = {"mv", "-i", "from/a", "from/b", "from/c", "to"};
    RunningTool tool(travel_.WithVolumes(command));
    ASSERT_TRUE(tool.WaitFor("overwrite 'to/b'? "));
    tool.Signal(SIGTERM);
    EXPECT_EQ(143, tool.Wait());
    ExpectWhole("to/a", "a");
    ExpectWhole("to/b", "old");
    ExpectWhole("from/b", "b");
    ExpectWhole("from/c", "c");
    const ToolResult result = Run({"mv", "from/b", "from/c", "to"});
    EXPECT_THAT(result, Succeeded());
    for (const char* name : {"a", "b", "c"}) ExpectWhole(std::string("to/") + name, name);
    EXPECT_THAT(Travel::ObjectsIn("from"), IsEmpty());
}

// ---- In the place of mv -------------------------------------------------------------------------

TEST_P(MvHabitsTest, UnderTheNameOfMvItSaysNoMoreThanMvDoes) {
    if (Tested().emulated()) GTEST_SKIP() << "the emulator has the name";
    Make("from/a", "a");
    const ProgramResult none = RunAs("mv", "from/none to");
    EXPECT_EQ("mv: cannot stat 'from/none': No such file or directory\n", none.output);
    EXPECT_EQ(1, none.status);
    EXPECT_EQ("mv: 'from/a' and 'from/a' are the same file\n", RunAs("mv", "from/a from/a").output);
    EXPECT_EQ("renamed 'from/a' -> 'to/a'\n", RunAs("mv", "-v from/a to").output);
}

}  // namespace
}  // namespace mavoea::test

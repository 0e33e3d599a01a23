// mavoea cp has the options and habits of coreutils' cp, and metadata goes with the object in each.

#include <sys/sysmacros.h>

#include "tests/tool/habits.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

using CpHabitsTest = HabitsTest;
INSTANTIATE_TEST_SUITE_P(VolumeTypes, CpHabitsTest, ::testing::ValuesIn(Types({0, 1, 2, 7})),
                         TypeName);

// ---- Written in place ---------------------------------------------------------------------------

TEST_P(CpHabitsTest, WhatIsWrittenOverStaysTheFileItIsAndLosesAllMetadata) {
    Make("from/a", "new");
    Make("to/a", "old");
    ASSERT_EQ(0, chmod("to/a", 0604));
    const ino_t inode = InodeOf("to/a");
    const int fd = open("to/a", O_RDONLY | O_CLOEXEC);
    EXPECT_THAT(Run({"cp", "from/a", "to/a"}), Succeeded());
    ExpectWhole("to/a", "new");
    EXPECT_EQ(inode, InodeOf("to/a"));
    EXPECT_EQ(0604, ModeOf("to/a"));
    char text[32] = {};
    EXPECT_EQ(11, pread(fd, text, sizeof text, 0));
    EXPECT_STREQ("data of new", text);
    close(fd);
    ExpectWhole("from/a", "new");

    WriteFile("from/plain", Ascii("no more"));
    EXPECT_THAT(Run({"cp", "from/plain", "to/a"}), Succeeded());
    EXPECT_EQ("no more", TextOf("to/a"));
    EXPECT_EQ(inode, InodeOf("to/a"));
    ExpectNoMetadata("to/a");
}

TEST_P(CpHabitsTest, OtherNamesOfWhatIsWrittenOverSeeTheNewData) {
    Make("from/a", "new");
    ASSERT_EQ(0, mkdir("to/own", 0755));
    Make("to/own/a", "old");
    ASSERT_EQ(0, link("to/own/a", "to/own/b"));
    const ino_t inode = InodeOf("to/own/a");
    ASSERT_EQ(0, chmod("to/own", 0755));
    EXPECT_THAT(Run({"cp", "from/a", "to/own/a"}), Succeeded());
    ExpectWhole("to/own/a", "new");
    EXPECT_EQ("data of new", TextOf("to/own/b"));
    EXPECT_EQ(inode, InodeOf("to/own/a"));
    EXPECT_EQ(inode, InodeOf("to/own/b"));
}

TEST_P(CpHabitsTest, WithAtomicOrRemoveDestinationAnotherFileTakesItsPlace) {
    for (const char* option : {"--atomic", "--remove-destination", "--rem"}) {
        SCOPED_TRACE(option);
        fs::remove_all("to");
        ASSERT_EQ(0, mkdir("to", 0755));
        Make("from/a", "new");
        Make("to/a", "old");
        ASSERT_EQ(0, link("to/a", "to/b"));
        const ino_t inode = InodeOf("to/a");
        EXPECT_THAT(Run({"cp", option, "from/a", "to/a"}), Succeeded());
        ExpectWhole("to/a", "new");
        EXPECT_NE(inode, InodeOf("to/a"));
        EXPECT_EQ(inode, InodeOf("to/b"));
        EXPECT_EQ("data of old", TextOf("to/b"));
    }
}

TEST_P(CpHabitsTest, WithoutARightToTheDirectoryTheDataArrivesAndTheMetadataIsNamed) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    Make("from/a", "new");
    WriteFile("to/a", Ascii("old"));
    ASSERT_EQ(0, chmod("from/a", 0644));
    ASSERT_EQ(0, chmod("to/a", 0666));
    ASSERT_EQ(0, chmod(travel_.dir().path().c_str(), 0755));
    const bool in_file = type() == kXattr;
    AsUser(1234, Root::kGivenUp, [&] {
        const ToolResult result = Run({"cp", "from/a", "to/a"});
        EXPECT_EQ(in_file ? 0 : 2, result.status) << result.err;
        EXPECT_THAT(result.err, HasSubstr(in_file ? "" : "from/a: "));
        EXPECT_THAT(result.err, HasSubstr(in_file ? "" : "metadata"));
    });
    EXPECT_EQ("data of new", TextOf("to/a"));
    if (in_file) ExpectMetadata("to/a", "new");
}

// ---- A service that changes the metadata --------------------------------------------------------

TEST_P(CpHabitsTest, WhatAServiceIsChangingStaysAsItIsAndTheRestArrives) {
    if (type() == kXattr) GTEST_SKIP() << "there is no file that a service could lock";
    for (const char* name : {"a", "b", "c"}) Make(std::string("from/") + name, name);
    Make("to/b", "old");
    const Bytes before = ReadFile(MetadataFileOf(type(), "to/b"));
    const HeldLock lock(MetadataFileOf(type(), "to/b"));
    const ToolResult result = Run({"cp", "from/a", "from/b", "from/c", "to"});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.err, HasSubstr("in use by another process"));
    EXPECT_THAT(result.err, HasSubstr("b"));
    EXPECT_EQ("data of old", TextOf("to/b"));
    // Closing a descriptor of the file would end the lock: the bytes are compared at the end.
    ExpectWhole("to/a", "a");
    ExpectWhole("to/c", "c");
    EXPECT_EQ(before, ReadFile(MetadataFileOf(type(), "to/b")));
}

TEST_P(CpHabitsTest, WhatWouldBeReplacedStaysAsItIsTooWhileAServiceIsChangingIt) {
    if (type() == kXattr) GTEST_SKIP() << "there is no file that a service could lock";
    for (const char* option : {"--atomic", "--remove-destination"}) {
        SCOPED_TRACE(option);
        Make("from/a", "new");
        Make("to/a", "old");
        const ino_t inode = InodeOf("to/a");
        const Bytes before = ReadFile(MetadataFileOf(type(), "to/a"));
        const HeldLock lock(MetadataFileOf(type(), "to/a"));
        EXPECT_EQ(1, Run({"cp", option, "from/a", "to/a"}).status);
        EXPECT_EQ("data of old", TextOf("to/a"));
        EXPECT_EQ(inode, InodeOf("to/a"));
        EXPECT_EQ(before, ReadFile(MetadataFileOf(type(), "to/a")));
    }
}

// ---- Symbolic links -----------------------------------------------------------------------------

TEST_P(CpHabitsTest, ALinkIsCopiedAsALinkWithPAndDAndInTrees) {
    Make("from/a", "a");
    ASSERT_EQ(0, symlink("a", "from/link"));
    const bool has_own = type() != kXattr;  // the kernel keeps no such attributes of links
    if (has_own) {
        ASSERT_EQ(0, Run({"set", "from/link", "user.colour", "link"}).status);
    }
    for (const char* option :
         {"-P", "-d", "-a", "-r", "-rP", "-LP", "--no-dereference", "--no-deref"}) {
        SCOPED_TRACE(option);
        EXPECT_THAT(Run({"cp", option, "from/link", "to/link"}), Succeeded());
        EXPECT_EQ("a", fs::read_symlink("to/link"));
        if (has_own) {
            EXPECT_EQ("link", Run({"get", "to/link", "user.colour"}).out);
        }
        ASSERT_THAT(Run({"rm", "to/link"}), Succeeded());
    }
}

TEST_P(CpHabitsTest, LinksOfTreesAreFollowedAsFarAsIsAskedFor) {
    Make("from/a", "a");
    MakeDirectory("from/tree", "tree");
    ASSERT_EQ(0, symlink("../a", "from/tree/inner"));
    ASSERT_EQ(0, symlink("tree", "from/outer"));
    const auto copy = [&](const char* option) {
        EXPECT_THAT(Run({"cp", "-r", option, "from/outer", "to/copy"}), Succeeded());
    };
    copy("-L");
    ExpectMetadata("to/copy", "tree");
    ExpectWhole("to/copy/inner", "a");
    EXPECT_FALSE(fs::is_symlink("to/copy/inner"));
    ASSERT_THAT(Run({"rm", "-r", "to/copy"}), Succeeded());

    copy("-H");
    ExpectMetadata("to/copy", "tree");
    EXPECT_EQ("../a", fs::read_symlink("to/copy/inner"));
    ASSERT_THAT(Run({"rm", "-r", "to/copy"}), Succeeded());

    copy("-P");
    EXPECT_EQ("tree", fs::read_symlink("to/copy"));
    EXPECT_THAT(Run({"cp", "-H", "from/outer/inner", "to/named"}), Succeeded());
    ExpectWhole("to/named", "a");
}

TEST_P(CpHabitsTest, ALinkToADirectoryThatItIsInIsNamedAndTheRestArrives) {
    MakeDirectory("from/tree", "tree");
    Make("from/tree/a", "a");
    ASSERT_EQ(0, symlink(".", "from/tree/again"));
    EXPECT_THAT(Run({"cp", "-rL", "from/tree", "to"}),
                Failed(1, "cannot copy cyclic symbolic link 'from/tree/again'; copy it with -P"));
    ExpectMetadata("to/tree", "tree");
    ExpectWhole("to/tree/a", "a");
}

TEST_P(CpHabitsTest, ALinkAtTheDestinationIsFollowed) {
    Make("from/a", "new");
    Make("to/real", "old");
    ASSERT_EQ(0, symlink("real", "to/link"));
    EXPECT_THAT(Run({"cp", "from/a", "to/link"}), Succeeded());
    EXPECT_EQ("real", fs::read_symlink("to/link"));
    ExpectWhole("to/real", "new");
    Make("to/real", "old");
    EXPECT_THAT(Run({"cp", "--remove-destination", "from/a", "to/link"}), Succeeded());
    EXPECT_FALSE(fs::is_symlink("to/link"));
    ExpectWhole("to/link", "new");
    ExpectWhole("to/real", "old");
}

TEST_P(CpHabitsTest, ALinkThatLeadsNowhereIsNotWrittenThrough) {
    Make("from/a", "new");
    ASSERT_EQ(0, symlink("nowhere", "to/link"));
    EXPECT_THAT(Run({"cp", "from/a", "to/link"}),
                Failed(1,
                       "not writing through dangling symlink 'to/link'; remove the link, or use "
                       "--remove-destination"));
    EXPECT_THAT(Travel::ObjectsIn("to"), ElementsAre("link"));
}

TEST_P(CpHabitsTest, ALinkThatTheSameCommandHasMadeIsNotWrittenThrough) {
    ASSERT_EQ(0, mkdir("from/one", 0755));
    ASSERT_EQ(0, mkdir("from/two", 0755));
    Make("from/outside", "outside");
    ASSERT_EQ(0, symlink("../from/outside", "from/one/x"));
    Make("from/two/x", "new");
    const ToolResult result = Run({"cp", "-d", "from/one/x", "from/two/x", "to"});
    EXPECT_THAT(result, Failed(1,
                               "will not copy 'from/two/x' through just-created symlink 'to/x'; "
                               "give it another name"));
    ExpectWhole("from/outside", "outside");
    EXPECT_EQ("../from/outside", fs::read_symlink("to/x"));
}

TEST_P(CpHabitsTest, InATreeALinkOrFifoReplacesAFile) {
    ASSERT_EQ(0, symlink("nowhere", "from/link"));
    ASSERT_EQ(0, mkfifo("from/fifo", 0644));
    for (const char* name : {"to/link", "to/fifo"}) Make(name, "old");
    EXPECT_THAT(Run({"cp", "-r", "from/link", "from/fifo", "to"}), Succeeded());
    EXPECT_EQ("nowhere", fs::read_symlink("to/link"));
    EXPECT_TRUE(fs::is_fifo("to/fifo"));
    for (const char* name : {"to/link", "to/fifo"}) ExpectNoMetadata(name);
}

// ---- What others may have put there -------------------------------------------------------------

TEST_P(CpHabitsTest, TheSuperuserFollowsNoLinkOfAnotherUser) {
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS("/tmp");
    Make("from/a", "new");
    Make("from/secret", "secret");
    ASSERT_EQ(0, symlink("../from/secret", "to/link"));
    ASSERT_EQ(0, lchown("to/link", 1234, 1234));
    EXPECT_THAT(Run({"cp", "from/a", "to/link"}), Succeeded());
    ExpectWhole("from/secret", "secret");
    EXPECT_FALSE(fs::is_symlink("to/link"));
    ExpectWhole("to/link", "new");

    ASSERT_EQ(0, symlink("secret", "from/link"));
    ASSERT_EQ(0, lchown("from/link", 1234, 1234));
    const ToolResult result = Run({"cp", "from/link", "to/copy"});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.err, HasSubstr("from/link: a symbolic link of another user"));
    EXPECT_FALSE(Exists("to/copy"));
    EXPECT_THAT(Run({"cp", "-P", "from/link", "to/copy"}), Succeeded());
    EXPECT_TRUE(fs::is_symlink("to/copy"));
}

TEST_P(CpHabitsTest, TheSuperuserWritesIntoNoFileToWhichOthersMayHaveGivenAName) {
    for (const mode_t mode : {0777U, 0775U, 01777U}) {
        SCOPED_TRACE(mode);
        Make("from/a", "new");
        Make("from/secret", "secret");
        ASSERT_EQ(0, link("from/secret", "to/a"));
        ASSERT_EQ(0, chmod("to", mode));
        EXPECT_THAT(Run({"cp", "from/a", "to/a"}), Succeeded());
        ExpectWhole("from/secret", "secret");
        ExpectWhole("to/a", "new");
        EXPECT_NE(InodeOf("from/secret"), InodeOf("to/a"));
        ASSERT_THAT(Run({"rm", "to/a"}), Succeeded());
    }
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS("/tmp");
    ASSERT_EQ(0, link("from/secret", "to/a"));
    ASSERT_EQ(0, chmod("to", 0755));
    ASSERT_EQ(0, chown("to", 1234, 1234));
    EXPECT_THAT(Run({"cp", "from/a", "to/a"}), Succeeded());
    ExpectWhole("from/secret", "secret");
    ExpectWhole("to/a", "new");
}

// ---- Only newer ---------------------------------------------------------------------------------

TEST_P(CpHabitsTest, WithUOnlyWhatIsNewerGoesWithAllThatItHas) {
    for (const char* option : {"-u", "--update"}) {
        SCOPED_TRACE(option);
        Make("from/a", "new");
        Make("to/a", "old");
        SetTime("from/a", 1000000000);
        SetTime("to/a", 1000000000);
        EXPECT_THAT(Run({"cp", option, "from/a", "to"}), Succeeded());
        ExpectWhole("to/a", "old");
        SetTime("from/a", 1000000001);
        EXPECT_THAT(Run({"cp", option, "from/a", "to"}), Succeeded());
        ExpectWhole("to/a", "new");
        ASSERT_THAT(Run({"rm", "to/a"}), Succeeded());
        EXPECT_THAT(Run({"cp", option, "from/a", "to"}), Succeeded());
        ExpectWhole("to/a", "new");
        ASSERT_THAT(Run({"rm", "to/a"}), Succeeded());
    }
}

// ---- Backups ------------------------------------------------------------------------------------

TEST_P(CpHabitsTest, ABackupKeepsTheMetadataOfWhatWasThere) {
    const struct {
        Arguments options;
        std::string backup;
    } cases[] = {
        {{"-b"}, "a~"},
        {{"--backup"}, "a~"},
        {{"--backup=simple"}, "a~"},
        {{"--backup=never"}, "a~"},
        {{"--backup=numbered"}, "a.~1~"},
        {{"--backup=t"}, "a.~1~"},
        {{"-S", ".old"}, "a.old"},
        {{"-b", "--suffix=.old"}, "a.old"},
    };
    for (const auto& [options, backup] : cases) {
        SCOPED_TRACE(::testing::PrintToString(options));
        Make("from/a", "new");
        Make("to/a", "old");
        const ino_t inode = InodeOf("to/a");
        Arguments arguments = {"cp", "-v", "from/a", "to"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        const ToolResult result = Run(arguments);
        EXPECT_THAT(result, Succeeded());
        EXPECT_EQ("'from/a' -> 'to/a' (backup: 'to/" + backup + "')\n", result.out);
        ExpectWhole("to/a", "new");
        ExpectWhole("to/" + backup, "old");
        EXPECT_EQ(inode, InodeOf("to/" + backup));
        EXPECT_THAT(Run({"rm", "to/a", "to/" + backup}), Succeeded());
        EXPECT_THAT(Travel::ObjectsIn("to"), IsEmpty());
    }
}

TEST_P(CpHabitsTest, BackupsAreNumberedWhereThereAreSuch) {
    Make("from/a", "new");
    Make("to/a", "old");
    Make("to/a.~9~", "older");
    EXPECT_THAT(Run({"cp", "-b", "from/a", "to"}), Succeeded());
    ExpectWhole("to/a.~10~", "old");
    ExpectWhole("to/a.~9~", "older");
    ExpectWhole("to/a", "new");
    EXPECT_THAT(Run({"cp", "--backup=none", "from/a", "to"}), Succeeded());
    EXPECT_THAT(Travel::ObjectsIn("to"), ElementsAre("a", "a.~10~", "a.~9~"));
}

TEST_P(CpHabitsTest, ABackupDestroysNoSource) {
    Make("to/a~", "new");
    Make("to/a", "old");
    EXPECT_THAT(Run({"cp", "-b", "to/a~", "to/a"}),
                Failed(1,
                       "backing up 'to/a' might destroy source;  'to/a~' not copied; use "
                       "--backup=numbered"));
    ExpectWhole("to/a", "old");
    ExpectWhole("to/a~", "new");
    EXPECT_THAT(Run({"cp", "-b", "-n", "to/a~", "to/a"}).err,
                HasSubstr("options --backup and --no-clobber are mutually exclusive"));
}

TEST_P(CpHabitsTest, AFileThatIsForcedOverItselfIsItsOwnBackup) {
    Make("from/a", "same");
    EXPECT_THAT(Run({"cp", "-bf", "from/a", "from/a"}), Succeeded());
    ExpectWhole("from/a", "same");
    ExpectWhole("from/a~", "same");
    EXPECT_NE(InodeOf("from/a"), InodeOf("from/a~"));
}

// ---- Links in place of copies -------------------------------------------------------------------

TEST_P(CpHabitsTest, AHardLinkIsOneMoreNameWithTheSameMetadata) {
    for (const char* option : {"-l", "--link"}) {
        SCOPED_TRACE(option);
        Make("from/a", "a");
        EXPECT_THAT(Run({"cp", option, "from/a", "to/b"}), Succeeded());
        EXPECT_EQ(InodeOf("from/a"), InodeOf("to/b"));
        ExpectWhole("from/a", "a");
        ExpectWhole("to/b", "a");
        ASSERT_THAT(Run({"rm", "to/b"}), Succeeded());
    }
    Make("to/b", "old");
    EXPECT_THAT(Run({"cp", "-l", "from/a", "to/b"}),
                Failed(1,
                       "cannot create hard link 'to/b' to 'from/a': File exists; try again, or "
                       "check the volume"));
    ExpectWhole("to/b", "old");
    EXPECT_THAT(Run({"cp", "-lf", "from/a", "to/b"}), Succeeded());
    EXPECT_EQ(InodeOf("from/a"), InodeOf("to/b"));
    ExpectWhole("to/b", "a");
    EXPECT_THAT(Run({"cp", "-l", "from/a", "to/b"}), Succeeded());
}

TEST_P(CpHabitsTest, ATreeOfHardLinksHasTheMetadataOfTheTree) {
    MakeDirectory("from/tree", "tree");
    Make("from/tree/a", "a");
    EXPECT_THAT(Run({"cp", "-rl", "from/tree", "to"}), Succeeded());
    ExpectMetadata("to/tree", "tree");
    EXPECT_EQ(InodeOf("from/tree/a"), InodeOf("to/tree/a"));
    ExpectWhole("to/tree/a", "a");
    ExpectWhole("from/tree/a", "a");
}

TEST_P(CpHabitsTest, SymbolicLinksAreMadeInPlaceOfCopies) {
    Make("from/a", "a");
    for (const char* option : {"-s", "--symbolic-link", "--sym"}) {
        SCOPED_TRACE(option);
        EXPECT_THAT(Run({"cp", option, travel_.From("a"), "to/a"}), Succeeded());
        EXPECT_EQ(travel_.From("a"), fs::read_symlink("to/a"));
        ASSERT_EQ(0, unlink("to/a"));
    }
    EXPECT_EQ(1, Run({"cp", "-s", "from/a", "to/a"}).status);
    EXPECT_FALSE(Exists("to/a"));
    EXPECT_THAT(Run({"cp", "-s", "from/a", "here"}), Succeeded());
    EXPECT_EQ("from/a", fs::read_symlink("here"));
    ExpectWhole("from/a", "a");
    Make("to/a", "old");
    EXPECT_THAT(Run({"cp", "-sf", travel_.From("a"), "to/a"}), Succeeded());
    EXPECT_TRUE(fs::is_symlink("to/a"));
    ExpectNoMetadata("to/a");
    EXPECT_EQ(1, Run({"cp", "-ls", travel_.From("a"), "to/b"}).status);
}

TEST_P(CpHabitsTest, LinksHaveNoNameThatEndsInASlash) {
    Make("from/a", "a");
    for (const char* option : {"-l", "-s", "-p"}) {
        SCOPED_TRACE(option);
        EXPECT_EQ(1, Run({"cp", option, travel_.From("a"), "to/new/"}).status);
    }
    EXPECT_THAT(Travel::ObjectsIn("to"), IsEmpty());
}

// ---- What is kept -------------------------------------------------------------------------------

TEST_P(CpHabitsTest, HardLinksStayLinksWhereThatIsAskedFor) {
    // All names of a file have one metadata there, or one record.
    const std::string second = type() == kXattr || type() == kFileEa ? "a" : "b";
    Make("from/a", "a");
    ASSERT_EQ(0, link("from/a", "from/b"));
    Give("from/b", second);
    for (const char* option :
         {"-d", "-a", "--preserve=links", "--pres=mode,links", "--preserve=all"}) {
        SCOPED_TRACE(option);
        EXPECT_THAT(Run({"cp", option, "from/a", "from/b", "to"}), Succeeded());
        EXPECT_EQ(InodeOf("to/a"), InodeOf("to/b"));
        ExpectWhole("to/a", "a");
        ExpectMetadata("to/b", second);
        ASSERT_THAT(Run({"rm", "to/a", "to/b"}), Succeeded());
    }
    for (const Arguments& options :
         std::vector<Arguments>{{"-p"}, {"-r"}, {"-a", "--no-preserve=links"}}) {
        SCOPED_TRACE(::testing::PrintToString(options));
        Arguments arguments = {"cp", "from/a", "from/b", "to"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        EXPECT_THAT(Run(arguments), Succeeded());
        EXPECT_NE(InodeOf("to/a"), InodeOf("to/b"));
        ExpectWhole("to/a", "a");
        ExpectMetadata("to/b", second);
    }
}

TEST_P(CpHabitsTest, WhatIsListedIsKeptAndMetadataAlwaysIs) {
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS("/tmp");
    Make("from/a", "a");
    ASSERT_EQ(0, chown("from/a", 1234, 4321));
    ASSERT_EQ(0, chmod("from/a", 0647));
    SetTime("from/a", 1000000000);
    const Umask umask(022);
    const struct {
        Arguments options;
        bool mode;
        bool owner;
        bool times;
    } cases[] = {
        {{}, false, false, false},
        {{"-p"}, true, true, true},
        {{"--preserve"}, true, true, true},
        {{"-a"}, true, true, true},
        {{"--preserve=mode"}, true, false, false},
        {{"--pres=mode"}, true, false, false},
        {{"--preserve=ownership"}, false, true, false},
        {{"--preserve=own"}, false, true, false},
        {{"--preserve=timestamps"}, false, false, true},
        {{"--preserve=mode,timestamps"}, true, false, true},
        {{"--preserve=all"}, true, true, true},
        {{"-p", "--no-preserve=ownership"}, true, false, true},
        {{"-p", "--no-preserve=timestamps,mode"}, false, true, false},
        {{"-a", "--no-preserve=all"}, false, false, false},
        {{"--no-preserve=all", "-p"}, true, true, true},
    };
    for (const auto& [options, mode, owner, times] : cases) {
        SCOPED_TRACE(::testing::PrintToString(options));
        Arguments arguments = {"cp", "from/a", "to/a"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        EXPECT_THAT(Run(arguments), Succeeded());
        const struct stat there = StatusOf("to/a");
        if (mode) {
            EXPECT_EQ(mode_t{0647}, there.st_mode & 07777);
        } else {
            EXPECT_NE(mode_t{0647}, there.st_mode & 07777);
        }
        EXPECT_EQ(owner ? 1234U : geteuid(), there.st_uid);
        EXPECT_EQ(owner ? 4321U : getegid(), there.st_gid);
        EXPECT_EQ(times, there.st_mtim.tv_sec == 1000000000);
        ExpectWhole("to/a", "a");
        ASSERT_THAT(Run({"rm", "to/a"}), Succeeded());
    }
    EXPECT_EQ(1, Run({"cp", "--preserve=nothing", "from/a", "to/a"}).status);
    EXPECT_EQ(1, Run({"cp", "--preserve=mode,nothing", "from/a", "to/a"}).status);
    EXPECT_FALSE(Exists("to/a"));
}

TEST_P(CpHabitsTest, WithoutTheSourcesModeANewFileHasTheUsualOne) {
    Make("from/a", "a");
    ASSERT_EQ(0, chmod("from/a", 0701));
    MakeDirectory("from/d", "d");
    ASSERT_EQ(0, chmod("from/d", 0700));
    const Umask umask(027);
    EXPECT_THAT(Run({"cp", "-r", "--no-preserve=mode", "from/a", "from/d", "to"}), Succeeded());
    EXPECT_EQ(0640, ModeOf("to/a"));
    EXPECT_EQ(0750, ModeOf("to/d"));
    ExpectWhole("to/a", "a");
    ExpectMetadata("to/d", "d");
}

TEST_P(CpHabitsTest, AttributesOnlyCarriesMetadataAndNoData) {
    Make("from/a", "new");
    Make("to/a", "old");
    const ino_t inode = InodeOf("to/a");
    EXPECT_THAT(Run({"cp", "--attributes-only", "from/a", "to/a"}), Succeeded());
    EXPECT_EQ("data of old", TextOf("to/a"));
    ExpectMetadata("to/a", "new");
    EXPECT_EQ(inode, InodeOf("to/a"));
    EXPECT_THAT(Run({"cp", "--attr", "from/a", "to/b"}), Succeeded());
    EXPECT_EQ("", TextOf("to/b"));
    ExpectMetadata("to/b", "new");
}

// ---- Paths --------------------------------------------------------------------------------------

TEST_P(CpHabitsTest, ParentsCarriesThePathsDirectoriesWithTheirMetadata) {
    MakeDirectory("from/x", "x");
    MakeDirectory("from/x/y", "y");
    Make("from/x/y/a", "a");
    const WorkingDirectory inside("from");
    const std::string to = travel_.target();
    EXPECT_THAT(Run({"cp", "--parents", "x//y/a", to}), Succeeded());
    ExpectMetadata(travel_.To("x"), "x");
    ExpectMetadata(travel_.To("x/y"), "y");
    ExpectWhole(travel_.To("x/y/a"), "a");
    EXPECT_EQ(1, Run({"cp", "--parents", "x/y/a", travel_.To("x/y/a")}).status);
    EXPECT_EQ(1, Run({"cp", "--parents", "x/y/a", travel_.To("none")}).status);
    ExpectWhole(travel_.To("x/y/a"), "a");
}

TEST_P(CpHabitsTest, ANameThatIsGivenTwiceGoesWhereItWasSentEachTime) {
    MakeDirectory("from/tree", "tree");
    Make("from/tree/a", "a");
    ASSERT_EQ(0, symlink("tree", "from/link"));
    const ToolResult result = Run({"cp", "from/tree/a", "from/link/a", "to"});
    EXPECT_EQ(0, result.status);
    EXPECT_EQ("mavoea: warning: source file 'from/link/a' specified more than once\n", result.err);
    ExpectWhole("to/a", "a");
    EXPECT_THAT(Run({"cp", "-r", "from/tree", "from/link/", "to"}), Succeeded());
    for (const char* name : {"to/tree", "to/link"}) {
        ExpectMetadata(name, "tree");
        ExpectWhole(std::string(name) + "/a", "a");
    }
    EXPECT_THAT(Run({"cp", "--parents", "from/tree/a", "from/link/a", "to"}), Succeeded());
    for (const char* name : {"to/from/tree/a", "to/from/link/a"}) ExpectWhole(name, "a");
}

TEST_P(CpHabitsTest, LinksBeforeDotsAreWhereTheyLead) {
    ASSERT_EQ(0, mkdir("from/deep", 0755));
    ASSERT_EQ(0, mkdir("from/deep/er", 0755));
    Make("from/deep/a", "there");
    Make("from/a", "here");
    ASSERT_EQ(0, symlink("deep/er", "from/link"));
    EXPECT_THAT(Run({"cp", "from/link/../a", "to"}), Succeeded());
    ExpectWhole("to/a", "there");
    ASSERT_EQ(0, mkdir("to/deep", 0755));
    ASSERT_EQ(0, mkdir("to/deep/er", 0755));
    ASSERT_EQ(0, symlink("deep/er", "to/link"));
    EXPECT_THAT(Run({"cp", "from/a", "to/link/../b"}), Succeeded());
    ExpectWhole("to/deep/b", "here");
    EXPECT_FALSE(Exists("to/b"));
}

TEST_P(CpHabitsTest, DotStandsForWhatIsInADirectory) {
    MakeDirectory("from/tree", "tree");
    Make("from/tree/a", "a");
    EXPECT_THAT(Run({"cp", "-r", "from/tree/.", "to"}), Succeeded());
    ExpectWhole("to/a", "a");
    ExpectMetadata("to", "tree");
    const WorkingDirectory inside("from/tree");
    EXPECT_THAT(Run({"cp", "-r", ".", travel_.To("copy")}), Succeeded());
    ExpectWhole(travel_.To("copy/a"), "a");
    ExpectMetadata(travel_.To("copy"), "tree");
}

TEST_P(CpHabitsTest, ASlashAtTheEndMeansADirectory) {
    Make("from/a", "a");
    MakeDirectory("from/tree", "tree");
    ASSERT_EQ(0, symlink("tree", "from/link"));
    EXPECT_THAT(Run({"cp", "from/a/", "to"}),
                Failed(1, "cannot stat 'from/a/': Not a directory; check the path"));
    EXPECT_THAT(Run({"cp", "--strip-trailing-slashes", "from/a//", "to"}), Succeeded());
    ExpectWhole("to/a", "a");
    EXPECT_THAT(Run({"cp", "-r", "from/link/", "to"}), Succeeded());
    EXPECT_FALSE(fs::is_symlink("to/link"));
    ExpectMetadata("to/link", "tree");
    EXPECT_THAT(Run({"cp", "-r", "--strip", "from/link/", "to/other"}), Succeeded());
    EXPECT_TRUE(fs::is_symlink("to/other"));
    EXPECT_EQ(1, Run({"cp", "from/a", "to/none/"}).status);
    EXPECT_THAT(Run({"cp", "-r", "from/tree/", "to/new/"}), Succeeded());
    ExpectMetadata("to/new", "tree");
}

TEST_P(CpHabitsTest, NamesAreShownAsTheyWereTyped) {
    MakeDirectory("from/tree", "tree");
    Make("from/tree/a", "a");
    EXPECT_EQ("'from//tree/./a' -> 'to/../to/a'\n",
              Run({"cp", "-v", "from//tree/./a", "to/../to"}).out);
    EXPECT_THAT(Run({"cp", "from/../from/none", "to"}),
                Failed(1,
                       "cannot stat 'from/../from/none': No such file or directory; check the "
                       "path"));
    EXPECT_EQ(
        "'./from/tree/' -> 'to/new'\n'./from/tree/a' -> 'to/new/a'\n2 copied (9 bytes), 0 "
        "failed\n",
        Run({"cp", "-rv", "./from/tree/", "to/new"}).out);
}

TEST_P(CpHabitsTest, ADirectoryOnAnotherFileSystemIsMadeAndLeftEmptyWithX) {
    MakeDirectory("from/tree", "tree");
    Make("from/tree/a", "a");
    ASSERT_EQ(0, mkdir("from/tree/point", 0755));
    const MountedHere mounted("from/tree/point");
    if (!mounted.ok()) GTEST_SKIP() << "takes the right to mount";
    WriteFile("from/tree/point/inner", Ascii("inner"));
    for (const char* option : {"-x", "--one-file-system", "--one"}) {
        SCOPED_TRACE(option);
        EXPECT_THAT(Run({"cp", "-r", option, "from/tree", "to"}), Succeeded());
        ExpectMetadata("to/tree", "tree");
        ExpectWhole("to/tree/a", "a");
        EXPECT_THAT(Travel::ObjectsIn("to/tree/point"), IsEmpty());
        ASSERT_THAT(Run({"rm", "-r", "to/tree"}), Succeeded());
    }
    EXPECT_THAT(Run({"cp", "-r", "from/tree", "to"}), Succeeded());
    EXPECT_EQ("inner", TextOf("to/tree/point/inner"));
}

// ---- Data ---------------------------------------------------------------------------------------

TEST_P(CpHabitsTest, HolesAreMadeAsIsAskedFor) {
    constexpr off_t kSize = 1 << 20;
    WriteFile("from/zeros", Bytes(kSize, 0));
    WriteFile("from/hole", Ascii("x"));
    ASSERT_EQ(0, truncate("from/hole", kSize));
    Give("from/zeros", "zeros");
    const auto blocks = [&](const char* when, const char* source) {
        EXPECT_THAT(Run({"cp", std::string("--sparse=") + when, std::string("from/") + source,
                         std::string("to/") + source}),
                    Succeeded());
        EXPECT_EQ(ReadFile(std::string("from/") + source), ReadFile(std::string("to/") + source));
        const struct stat info = StatusOf(std::string("to/") + source);
        EXPECT_THAT(Run({"rm", std::string("to/") + source}), Succeeded());
        return info.st_blocks * 512;
    };
    EXPECT_GT(kSize / 4, blocks("always", "zeros"));
    EXPECT_LE(kSize, blocks("never", "zeros"));
    EXPECT_LE(kSize, blocks("never", "hole"));
    EXPECT_GT(kSize / 4, blocks("auto", "hole"));
    EXPECT_GT(kSize / 4, blocks("alw", "hole"));
    EXPECT_THAT(Run({"cp", "--sparse=always", "from/zeros", "to/zeros"}), Succeeded());
    ExpectMetadata("to/zeros", "zeros");
    EXPECT_EQ(1, Run({"cp", "--sparse=perhaps", "from/zeros", "to/a"}).status);
}

TEST_P(CpHabitsTest, BlocksAreSharedOrThereIsNoCopyWhereThatIsAskedFor) {
    Make("from/a", "a");
    for (const char* option : {"--reflink=auto", "--reflink=never"}) {
        EXPECT_THAT(Run({"cp", option, "from/a", "to/" + std::string(option)}), Succeeded());
        ExpectWhole("to/" + std::string(option), "a");
    }
    const ToolResult result = Run({"cp", "--reflink", "from/a", "to/a"});
    if (result.status == 0) {
        ExpectWhole("to/a", "a");
    } else {
        EXPECT_EQ(1, result.status);
        EXPECT_THAT(result.err, HasSubstr("failed to clone 'to/a' from 'from/a'"));
    }
    EXPECT_EQ(1, Run({"cp", "--reflink=always", "--sparse=always", "from/a", "to/b"}).status);
    EXPECT_FALSE(Exists("to/b"));
}

TEST_P(CpHabitsTest, WhatAFifoGivesIsCopiedAndInTreesWithCopyContents) {
    ASSERT_EQ(0, mkdir("from/tree", 0755));
    ASSERT_EQ(0, mkfifo("from/tree/fifo", 0644));
    Make("to/named", "old");
    const auto fed = [&](const Arguments& arguments) {
        RunningTool tool(travel_.WithVolumes(arguments));
        const int fd = open("from/tree/fifo", O_WRONLY | O_CLOEXEC);  // waits for the reader
        EXPECT_EQ(3, write(fd, "fed", 3));
        close(fd);
        EXPECT_EQ(0, tool.Wait()) << tool.said();
    };
    fed({"cp", "from/tree/fifo", "to/named"});
    EXPECT_EQ("fed", TextOf("to/named"));
    ExpectNoMetadata("to/named");
    fed({"cp", "-r", "--copy-contents", "from/tree", "to"});
    EXPECT_EQ("fed", TextOf("to/tree/fifo"));
    EXPECT_THAT(Run({"cp", "-r", "from/tree", "to/other"}), Succeeded());
    EXPECT_TRUE(fs::is_fifo("to/other/fifo"));
    EXPECT_THAT(Run({"cp", "/dev/stdin", "to/input"}, "from standard input"), Succeeded());
    EXPECT_EQ("from standard input", TextOf("to/input"));
}

TEST_P(CpHabitsTest, ADestinationThatIsNoRegularFileIsWrittenToAndStays) {
    Make("from/a", "a");
    ASSERT_EQ(0, symlink("/proc/self/fd/1", "to/stdout"));  // as /dev/stdout is
    EXPECT_EQ("data of a", Run({"cp", "from/a", "to/stdout"}).out);
    EXPECT_TRUE(fs::is_symlink("to/stdout"));
    if (mknod("to/null", S_IFCHR | 0666, makedev(1, 3)) == 0 && access("to/null", W_OK) == 0) {
        const bool opens = close(open("to/null", O_WRONLY | O_CLOEXEC)) == 0;
        EXPECT_EQ(opens ? 0 : 1, Run({"cp", "from/a", "to/null"}).status);
        EXPECT_TRUE(fs::is_character_file("to/null"));
    }
    ASSERT_EQ(0, mkfifo("to/fifo", 0644));
    RunningTool tool(travel_.WithVolumes({"cp", "from/a", "to/fifo"}));
    const int fd = open("to/fifo", O_RDONLY | O_CLOEXEC);
    char text[32] = {};
    EXPECT_EQ(9, read(fd, text, sizeof text));
    EXPECT_STREQ("data of a", text);
    close(fd);
    EXPECT_EQ(0, tool.Wait()) << tool.said();
    EXPECT_TRUE(fs::is_fifo("to/fifo"));
}

// ---- What is there already ----------------------------------------------------------------------

TEST_P(CpHabitsTest, WithNWhatIsThereStaysEvenIfItIsTheSource) {
    Make("from/a", "new");
    Make("to/a", "old");
    EXPECT_THAT(Run({"cp", "-n", "from/a", "to"}), Succeeded());
    EXPECT_THAT(Run({"cp", "-n", "to/a", "to"}), Succeeded());
    ExpectWhole("to/a", "old");
}

TEST_P(CpHabitsTest, WhatCannotBeOpenedIsReplacedWithF) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    OpenForAll();
    Make("from/a", "new");
    ASSERT_EQ(0, chmod("from/a", 0644));
    WriteFile("to/a", Ascii("old"));
    ASSERT_EQ(0, chmod("to/a", 0444));
    const ino_t inode = InodeOf("to/a");
    AsUser(1234, Root::kGivenUp, [&] {
        EXPECT_EQ(1, Run({"cp", "from/a", "to/a"}).status);
        EXPECT_EQ("old", TextOf("to/a"));
        EXPECT_NE(1, Run({"cp", "-f", "from/a", "to/a"}).status);
    });
    EXPECT_EQ("data of new", TextOf("to/a"));
    EXPECT_NE(inode, InodeOf("to/a"));
}

// ---- Interrupted --------------------------------------------------------------------------------

TEST_P(CpHabitsTest, AfterAnInterruptASecondRunBringsAllOfIt) {
    ASSERT_EQ(0, mkfifo("from/fifo", 0644));
    for (const char* name : {"a", "z"}) Make(std::string("from/") + name, name);
    Make("to/z", "old");
    const Arguments command = {"cp", "from/a", "from/fifo", "from/z", "to"};
    RunningTool tool(travel_.WithVolumes(command));
    int fd = open("from/fifo", O_WRONLY | O_CLOEXEC);
    ASSERT_EQ(5, write(fd, "begin", 5));
    tool.Signal(SIGINT);
    close(fd);
    EXPECT_EQ(130, tool.Wait());
    ExpectWhole("to/a", "a");
    ExpectWhole("to/z", "old");
    RunningTool again(travel_.WithVolumes(command));
    fd = open("from/fifo", O_WRONLY | O_CLOEXEC);
    ASSERT_EQ(3, write(fd, "all", 3));
    close(fd);
    EXPECT_EQ(0, again.Wait()) << again.said();
    ExpectWhole("to/a", "a");
    ExpectWhole("to/z", "z");
    EXPECT_EQ("all", TextOf("to/fifo"));
}

// ---- In the place of cp -------------------------------------------------------------------------

TEST_P(CpHabitsTest, UnderTheNameOfCpItSaysNoMoreThanCpDoes) {
    if (Tested().emulated()) GTEST_SKIP() << "the emulator has the name";
    Make("from/a", "a");
    Make("to/a", "old");
    const ProgramResult none = RunAs("cp", "from/none to");
    EXPECT_EQ("cp: cannot stat 'from/none': No such file or directory\n", none.output);
    EXPECT_EQ(1, none.status);
    const ProgramResult bad = RunAs("cp", "from/a");
    EXPECT_EQ(
        "cp: missing destination file operand after 'from/a'\n"
        "Try 'cp --help' for more information.\n",
        bad.output);
    EXPECT_EQ("'from/a' -> 'to/a'\n", RunAs("cp", "-v from/a to").output);
    const ProgramResult copied = RunAs("cp", "from/a to");
    EXPECT_EQ("", copied.output);
    EXPECT_EQ(0, copied.status);
}

}  // namespace
}  // namespace mavoea::test

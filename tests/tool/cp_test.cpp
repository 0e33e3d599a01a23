// mavoea cp, on real files.

#include <sys/acl.h>

#include "tests/support/stream_builder.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

struct Pair {
    int from;
    int to;
};
std::string NameOf(const ::testing::TestParamInfo<Pair>& info) {
    return "From" + std::to_string(info.param.from) + "To" + std::to_string(info.param.to);
}
std::vector<Pair> AllPairs() {
    std::vector<Pair> pairs;
    for (const int from : {kAppleDouble, kEaDirectory, kFileEa, kXattr}) {
        for (const int to : {kAppleDouble, kEaDirectory, kFileEa, kXattr}) {
            pairs.push_back({from, to});
        }
    }
    return pairs;
}

class CpPairTest : public ::testing::TestWithParam<Pair> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    }
};
INSTANTIATE_TEST_SUITE_P(EveryPair, CpPairTest, ::testing::ValuesIn(Thinned(AllPairs())), NameOf);

TEST_P(CpPairTest, FilesGoWithDataAndMetadata) {
    const Travel travel(GetParam().from, GetParam().to);
    travel.MakeFile(travel.From("a"));
    travel.GiveMetadata(travel.From("a"));
    EXPECT_THAT(travel.Run({"cp", travel.From("a"), travel.To("b")}), Succeeded());
    EXPECT_EQ("data", TextOf(travel.To("b")));
    travel.ExpectMetadata(travel.To("b"));
    EXPECT_EQ("data", TextOf(travel.From("a")));
    travel.ExpectMetadata(travel.From("a"));
    EXPECT_THAT(Travel::ObjectsIn(travel.target()), ElementsAre("b"));
}

TEST_P(CpPairTest, ANamedAttributeAloneArrives) {
    const Travel travel(GetParam().from, GetParam().to);
    travel.MakeFile(travel.From("a"));
    ASSERT_EQ(0, travel.Run({"set", travel.From("a"), Colour(), "red"}).status);
    EXPECT_THAT(travel.Run({"cp", travel.From("a"), travel.To("a")}), Succeeded());
    EXPECT_EQ("red", travel.Run({"get", travel.To("a"), Colour()}).out);
}

TEST_P(CpPairTest, DirectoriesGoWithAllThatIsInThem) {
    const Travel travel(GetParam().from, GetParam().to);
    mkdir(travel.From("tree").c_str(), 0755);
    mkdir(travel.From("tree/sub").c_str(), 0755);
    travel.MakeFile(travel.From("tree/sub/file"));
    travel.GiveMetadata(travel.From("tree"), "white");
    travel.GiveMetadata(travel.From("tree/sub"), "black");
    travel.GiveMetadata(travel.From("tree/sub/file"), "green");
    const ToolResult result =
        travel.Run({"--json", "cp", "-r", travel.From("tree"), travel.target()});
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(3, result.json()["done"]);
    EXPECT_EQ("data", TextOf(travel.To("tree/sub/file")));
    travel.ExpectMetadata(travel.To("tree"), "white");
    travel.ExpectMetadata(travel.To("tree/sub"), "black");
    travel.ExpectMetadata(travel.To("tree/sub/file"), "green");
}

TEST_P(CpPairTest, DifficultNamesAreNamesLikeAnyOther) {
    const Travel travel(GetParam().from, GetParam().to);
    for (const std::string& name : DifficultNames()) {
        SCOPED_TRACE(name);
        travel.MakeFile(travel.From(name), name);
        travel.GiveMetadata(travel.From(name));
        EXPECT_THAT(travel.Run({"cp", travel.From(name), travel.target()}), Succeeded());
        EXPECT_EQ(name, TextOf(travel.To(name)));
        travel.ExpectMetadata(travel.To(name));
    }
}

TEST_P(CpPairTest, TheMetadataOfWhatIsOverwrittenGoesWithIt) {
    const Travel travel(GetParam().from, GetParam().to);
    travel.MakeFile(travel.From("a"), "new");
    travel.MakeFile(travel.To("a"), "old");
    travel.GiveMetadata(travel.To("a"));
    EXPECT_THAT(travel.Run({"cp", travel.From("a"), travel.To("a")}), Succeeded());
    EXPECT_EQ("new", TextOf(travel.To("a")));
    travel.ExpectNoMetadata(travel.To("a"));
}

TEST_P(CpPairTest, ModeAndTimesAreKept) {
    const Travel travel(GetParam().from, GetParam().to);
    for (const mode_t mode : {0644U, 0600U, 0755U, 0640U, 0440U, 04755U}) {
        const std::string name = "mode" + std::to_string(mode);
        travel.MakeFile(travel.From(name));
        travel.GiveMetadata(travel.From(name));
        ASSERT_EQ(0, chmod(travel.From(name).c_str(), mode));
        const timespec times[] = {{1000000000, 123456789}, {1100000000, 987654321}};
        ASSERT_EQ(0, utimensat(AT_FDCWD, travel.From(name).c_str(), times, 0));
        EXPECT_THAT(travel.Run({"cp", "-p", travel.From(name), travel.To(name)}), Succeeded());
        const struct stat there = StatusOf(travel.To(name));
        EXPECT_EQ(1000000000, there.st_atim.tv_sec);
        EXPECT_EQ(123456789, there.st_atim.tv_nsec);
        EXPECT_EQ(1100000000, there.st_mtim.tv_sec);
        EXPECT_EQ(987654321, there.st_mtim.tv_nsec);
        // On these, the permissions are the lock, and it is not locked where the marks are others.
        const bool marked = GetParam().from == kEaDirectory || GetParam().from == kFileEa;
        const bool by_mode = GetParam().to == kAppleDouble || GetParam().to == kXattr;
        const mode_t wanted = mode == 0440 && marked && by_mode ? 0640 : mode;
        EXPECT_EQ(wanted, there.st_mode & 07777) << std::oct << mode;
    }
}

// They need more than 32 bits.
TEST_P(CpPairTest, TimesOfAnotherCenturyAreKept) {
    const Travel travel(GetParam().from, GetParam().to);
    travel.MakeFile(travel.From("a"));
    travel.GiveMetadata(travel.From("a"));
    constexpr long long kIn2174 = 6437664000;
    const timespec times[] = {{kIn2174, 0}, {kIn2174 + 1, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, travel.From("a").c_str(), times, 0));
    ASSERT_EQ(kIn2174, StatusOf(travel.From("a")).st_atim.tv_sec);
    EXPECT_THAT(travel.Run({"cp", "-p", travel.From("a"), travel.To("a")}), Succeeded());
    const struct stat there = StatusOf(travel.To("a"));
    EXPECT_EQ(kIn2174, there.st_atim.tv_sec);
    EXPECT_EQ(kIn2174 + 1, there.st_mtim.tv_sec);
    travel.ExpectMetadata(travel.To("a"));
}

TEST_P(CpPairTest, TheLockedStateGoesAlong) {
    const Travel travel(GetParam().from, GetParam().to);
    travel.MakeFile(travel.From("a"));
    ASSERT_EQ(0, travel.Run({"lock", travel.From("a")}).status);
    EXPECT_THAT(travel.Run({"cp", travel.From("a"), travel.To("a")}), Succeeded());
    EXPECT_EQ("1", travel.Run({"get", travel.To("a"), "mavoea.locked"}).out);
}

std::string CannotCreate(const std::string& path) {
    return "cannot create regular file '" + path +
           "': Permission denied; run mavoea as a user who may, or as root";
}

class CpTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    }
    const Travel travel_{kEaDirectory, kEaDirectory};
};

TEST_F(CpTest, WhatACopyIsMarkedWithDoesNotKeepItFromBeingCopied) {
    const Travel to(kEaDirectory, kXattr);
    to.MakeFile(to.From("a"));
    EXPECT_THAT(to.Run({"cp", to.From("a"), to.To("a")}), Succeeded());
    const Travel back(kXattr, kAppleDouble);
    EXPECT_THAT(RunTool({"--volume", to.target() + "=7", "--volume", back.target() + "=0", "cp",
                         to.To("a"), back.To("a")}),
                Succeeded());
    EXPECT_EQ("data", TextOf(back.To("a")));
}

TEST_F(CpTest, NoFileBesideAnotherNameIsTakenForMetadata) {
    const Travel travel(kEaDirectory, kAppleDouble);
    travel.MakeFile(travel.From("a?"));
    travel.GiveMetadata(travel.From("a?"));
    // The name that stands for "a?" on FAT, with metadata of its own.
    const std::string on_fat = "a\xEF\x80\xA5";
    travel.MakeFile(travel.To("._" + on_fat), "another's");
    EXPECT_THAT(travel.Run({"cp", travel.From("a?"), travel.target()}), Succeeded());
    EXPECT_EQ("data", TextOf(travel.To("a?")));
    travel.ExpectMetadata(travel.To("a?"));
    EXPECT_EQ("another's", TextOf(travel.To("._" + on_fat)));
    EXPECT_THAT(NamesIn(travel.target()), ElementsAre("._a?", "._" + on_fat, "a?"));
}

TEST_F(CpTest, OwnerAttributesAndAclAreKept) {
    const std::string from = travel_.From("a");
    travel_.MakeFile(from);
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS(travel_.source());
    ASSERT_EQ(0, chown(from.c_str(), 1234, 4321));
    ASSERT_EQ(0, setxattr(from.c_str(), "user.other", "value", 5, 0));
    ASSERT_EQ(0, setxattr(from.c_str(), "user.Beagle.Uid", "index", 5, 0));
    const acl_t acl = acl_from_text("u::rw-,u:77:r--,g::r--,m::r--,o::---");
    ASSERT_NE(nullptr, acl);
    ASSERT_EQ(0, acl_set_file(from.c_str(), ACL_TYPE_ACCESS, acl));
    acl_free(acl);
    EXPECT_THAT(travel_.Run({"cp", "-a", from, travel_.To("a")}), Succeeded());
    const struct stat there = StatusOf(travel_.To("a"));
    EXPECT_EQ(1234U, there.st_uid);
    EXPECT_EQ(4321U, there.st_gid);
    char value[16];
    EXPECT_EQ(5, getxattr(travel_.To("a").c_str(), "user.other", value, sizeof value));
    // What /etc/xattr.conf says is skipped.
    EXPECT_GT(0, getxattr(travel_.To("a").c_str(), "user.Beagle.Uid", value, sizeof value));
    const acl_t copied = acl_get_file(travel_.To("a").c_str(), ACL_TYPE_ACCESS);
    ASSERT_NE(nullptr, copied);
    char* const text = acl_to_text(copied, nullptr);
    EXPECT_THAT(text, HasSubstr("user:77:r--"));
    acl_free(text);
    acl_free(copied);
}

TEST_F(CpTest, ANewFileIsTheCopiersOwn) {
    const std::string from = travel_.From("a");
    travel_.MakeFile(from);
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS(travel_.source());
    ASSERT_EQ(0, chown(from.c_str(), 1234, 4321));
    ASSERT_EQ(0, chmod(from.c_str(), 06757));
    const timespec old[] = {{1000000000, 0}, {1000000000, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, from.c_str(), old, 0));
    ASSERT_EQ(0, setxattr(from.c_str(), "user.other", "value", 5, 0));
    const Umask umask(027);
    EXPECT_THAT(travel_.Run({"cp", from, travel_.To("a")}), Succeeded());
    const struct stat there = StatusOf(travel_.To("a"));
    EXPECT_EQ(geteuid(), there.st_uid);
    EXPECT_EQ(getegid(), there.st_gid);
    EXPECT_EQ(mode_t{0750}, there.st_mode & 07777);
    EXPECT_LT(1000000000, there.st_mtim.tv_sec);
    char value[16];
    EXPECT_EQ(5, getxattr(travel_.To("a").c_str(), "user.other", value, sizeof value));
}

TEST_F(CpTest, HolesStayHoles) {
    const std::string from = travel_.From("a");
    travel_.MakeFile(from, "begin");
    ASSERT_EQ(0, truncate(from.c_str(), 64 << 20));
    EXPECT_THAT(travel_.Run({"cp", from, travel_.To("a")}), Succeeded());
    const struct stat there = StatusOf(travel_.To("a"));
    EXPECT_EQ(64 << 20, there.st_size);
    EXPECT_GT(1 << 20, there.st_blocks * 512);
}

TEST_F(CpTest, HardLinksStayLinksOfOneFile) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/a"));
    ASSERT_EQ(0, link(travel_.From("tree/a").c_str(), travel_.From("tree/b").c_str()));
    travel_.GiveMetadata(travel_.From("tree/b"), "own");
    EXPECT_THAT(travel_.Run({"cp", "-a", travel_.From("tree"), travel_.To("tree")}), Succeeded());
    EXPECT_EQ(StatusOf(travel_.To("tree/a")).st_ino, StatusOf(travel_.To("tree/b")).st_ino);
    EXPECT_EQ(2U, StatusOf(travel_.To("tree/a")).st_nlink);
    travel_.ExpectMetadata(travel_.To("tree/b"), "own");
    travel_.ExpectNoMetadata(travel_.To("tree/a"));
    EXPECT_THAT(Travel::ObjectsIn(travel_.To("tree")), ElementsAre("a", "b"));
}

TEST_F(CpTest, NamesOfOneFileAreFilesOfTheirOwnWhereLinksAreNotKept) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/a"));
    ASSERT_EQ(0, link(travel_.From("tree/a").c_str(), travel_.From("tree/b").c_str()));
    travel_.GiveMetadata(travel_.From("tree/b"), "own");
    EXPECT_THAT(travel_.Run({"cp", "-r", travel_.From("tree"), travel_.To("tree")}), Succeeded());
    for (const char* name : {"tree/a", "tree/b"}) {
        EXPECT_EQ(1U, StatusOf(travel_.To(name)).st_nlink);
        EXPECT_EQ("data", TextOf(travel_.To(name)));
    }
    travel_.ExpectMetadata(travel_.To("tree/b"), "own");
    travel_.ExpectNoMetadata(travel_.To("tree/a"));
}

TEST_F(CpTest, InATreeSymbolicLinksAndSpecialFilesAreMadeAnew) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("outside"));
    ASSERT_EQ(0, chmod(travel_.From("outside").c_str(), 0640));
    ASSERT_EQ(0, symlink("../outside", travel_.From("tree/link").c_str()));
    ASSERT_EQ(0, symlink("nowhere", travel_.From("tree/dangling").c_str()));
    ASSERT_EQ(0, mkfifo(travel_.From("tree/fifo").c_str(), 0620));
    ASSERT_EQ(0, chmod(travel_.From("tree/fifo").c_str(), 0620));
    travel_.MakeFile(travel_.To("outside"), "untouched");
    ASSERT_EQ(0, chmod(travel_.To("outside").c_str(), 0640));
    EXPECT_THAT(travel_.Run({"cp", "-rp", travel_.From("tree"), travel_.target()}), Succeeded());
    EXPECT_EQ("../outside", std::filesystem::read_symlink(travel_.To("tree/link")));
    EXPECT_EQ("nowhere", std::filesystem::read_symlink(travel_.To("tree/dangling")));
    EXPECT_EQ(mode_t{S_IFIFO | 0620}, StatusOf(travel_.To("tree/fifo")).st_mode);
    EXPECT_EQ(mode_t{S_IFREG | 0640}, StatusOf(travel_.To("outside")).st_mode);
    char value[16];
    EXPECT_GT(0, getxattr(travel_.To("outside").c_str(), "user.mavo.attributes", value, 16));
}

TEST_F(CpTest, WithoutATreeLinksAreFollowedWithTheirMetadata) {
    travel_.MakeFile(travel_.From("a"));
    travel_.GiveMetadata(travel_.From("a"));
    ASSERT_EQ(0, symlink("a", travel_.From("link").c_str()));
    EXPECT_THAT(travel_.Run({"cp", travel_.From("link"), travel_.To("b")}), Succeeded());
    EXPECT_EQ(mode_t{S_IFREG}, StatusOf(travel_.To("b")).st_mode & S_IFMT);
    travel_.ExpectMetadata(travel_.To("b"));
}

TEST_F(CpTest, MetadataIsNoObjectOfItsOwnAndWhatIsOfNoObjectGoesAlong) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/a"));
    travel_.GiveMetadata(travel_.From("tree/a"));
    travel_.MakeFile(travel_.From("tree/._a"), "no AppleDouble file");
    travel_.MakeFile(travel_.From("tree/._gone"), "whose?");
    const Bytes apple_double = StreamImage{.attributes = {{"a", Ascii("1")}}}.Build();
    WriteFile(travel_.From("tree/._missing"), apple_double);
    travel_.MakeFile(travel_.From("tree/@eaDir/gone@MavoEAStream"), "of none");
    const ToolResult result = travel_.Run({"cp", "-r", travel_.From("tree"), travel_.To("tree")});
    EXPECT_THAT(result, Succeeded());
    EXPECT_THAT(NamesIn(travel_.To("tree")),
                ElementsAre("._a", "._gone", "._missing", "@eaDir", "a"));
    EXPECT_EQ("no AppleDouble file", TextOf(travel_.To("tree/._a")));
    EXPECT_EQ("whose?", TextOf(travel_.To("tree/._gone")));
    EXPECT_EQ(apple_double, ReadFile(travel_.To("tree/._missing")));
    EXPECT_THAT(NamesIn(travel_.To("tree/@eaDir")),
                ElementsAre("a@MavoEAStream", "a@MavoResource", "gone@MavoEAStream"));
    EXPECT_EQ("of none", TextOf(travel_.To("tree/@eaDir/gone@MavoEAStream")));
    travel_.ExpectMetadata(travel_.To("tree/a"));
}

TEST_F(CpTest, FilesOfOtherServicesInTheLegacyFolderGoAlong) {
    travel_.MakeFile(travel_.From("a"));
    mkdir(travel_.From("@eaDir").c_str(), 0777);
    mkdir(travel_.From("@eaDir/a").c_str(), 0777);
    travel_.MakeFile(travel_.From("@eaDir/a/MAVOPHOTO:THUMB_S.jpg"), "thumbnail");
    EXPECT_THAT(travel_.Run({"cp", travel_.From("a"), travel_.To("b")}), Succeeded());
    EXPECT_EQ("thumbnail", TextOf(travel_.To("@eaDir/b/MAVOPHOTO:THUMB_S.jpg")));
}

TEST_F(CpTest, OfAskingAndNeverTheLastCountsAndForcingUndoesNeither) {
    travel_.MakeFile(travel_.From("a"), "new");
    const auto text_after = [&](Arguments flags, const std::string& answer) {
        travel_.MakeFile(travel_.To("a"), "old");
        flags.insert(flags.begin(), "cp");
        flags.insert(flags.end(), {travel_.From("a"), travel_.To("a")});
        EXPECT_EQ(0, travel_.Run(flags, answer).status);
        return TextOf(travel_.To("a"));
    };
    EXPECT_EQ("new", text_after({}, "n\n"));
    EXPECT_EQ("old", text_after({"-i"}, "n\n"));
    EXPECT_EQ("old", text_after({"-i"}, ""));
    EXPECT_EQ("new", text_after({"-i"}, "yes\n"));
    EXPECT_EQ("old", text_after({"-n"}, "y\n"));
    EXPECT_EQ("old", text_after({"-i", "-n"}, "y\n"));
    EXPECT_EQ("new", text_after({"-n", "-i"}, "y\n"));
    EXPECT_EQ("old", text_after({"-n", "-i"}, "n\n"));
    EXPECT_EQ("old", text_after({"-n", "-f"}, "y\n"));
    EXPECT_EQ("old", text_after({"-i", "-f"}, "n\n"));
    EXPECT_EQ("old", text_after({"-f", "-i"}, "n\n"));
    EXPECT_EQ("old", text_after({"-f", "-n"}, "y\n"));
    EXPECT_EQ("old", text_after({"-fn"}, "y\n"));
    EXPECT_EQ("old", text_after({"-nf", "-p"}, "y\n"));
}

TEST_F(CpTest, TheQuestionNamesWhatWouldBeLost) {
    travel_.MakeFile(travel_.From("a"));
    travel_.MakeFile(travel_.To("a"));
    EXPECT_EQ("mavoea: overwrite '" + travel_.To("a") + "'? ",
              travel_.Run({"cp", "-i", travel_.From("a"), travel_.To("a")}, "y\n").err);
}

TEST_F(CpTest, SeveralSourcesGoIntoADirectoryAndFailuresAreTold) {
    travel_.MakeFile(travel_.From("a"));
    travel_.MakeFile(travel_.From("c"));
    const ToolResult result = travel_.Run(
        {"cp", travel_.From("a"), travel_.From("b"), travel_.From("c"), travel_.target()});
    EXPECT_EQ(1, result.status);
    EXPECT_EQ("", result.out);
    EXPECT_EQ("mavoea: cannot stat '" + travel_.From("b") +
                  "': No such file or directory; check the path\n",
              result.err);
    EXPECT_THAT(Travel::ObjectsIn(travel_.target()), ElementsAre("a", "c"));
}

TEST_F(CpTest, TheDestinationMayStandInFront) {
    travel_.MakeFile(travel_.From("a"));
    EXPECT_THAT(travel_.Run({"cp", "-t", travel_.target(), travel_.From("a")}), Succeeded());
    EXPECT_TRUE(Exists(travel_.To("a")));
    EXPECT_THAT(
        travel_.Run({"cp", "-t", travel_.To("a"), travel_.From("a")}),
        Failed(1, "target directory '" + travel_.To("a") + "': Not a directory; check the path"));
}

TEST_F(CpTest, WithTTheDestinationIsTheObject) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/a"));
    mkdir(travel_.To("there").c_str(), 0755);
    EXPECT_THAT(travel_.Run({"cp", "-rT", travel_.From("tree"), travel_.To("there")}), Succeeded());
    EXPECT_THAT(NamesIn(travel_.To("there")), ElementsAre("a"));
    EXPECT_THAT(travel_.Run({"cp", "-T", travel_.From("tree/a"), travel_.To("there")}),
                Failed(1, "cannot overwrite directory '" + travel_.To("there") +
                              "' with non-directory; move it away"));
}

TEST_F(CpTest, WhatMakesNoSenseIsRefused) {
    const std::string file = travel_.From("file");
    const std::string tree = travel_.From("tree");
    travel_.MakeFile(file);
    mkdir(tree.c_str(), 0755);
    ASSERT_EQ(0, link(file.c_str(), travel_.From("name").c_str()));
    ASSERT_EQ(0, symlink("file", travel_.From("link").c_str()));
    const std::string same = "' are the same file; name another destination";
    const struct {
        Arguments arguments;
        std::string message;
    } cases[] = {
        {{file},
         "missing destination file operand after '" + file +
             "'\nTry 'mavoea cp --help' for more information."},
        {{tree, travel_.To("x")}, "-r not specified; omitting directory '" + tree + "'; use -r"},
        {{file, file}, "'" + file + "' and '" + file + same},
        {{file, travel_.From("name")}, "'" + file + "' and '" + travel_.From("name") + same},
        {{"-r", travel_.From("link"), file}, "'" + travel_.From("link") + "' and '" + file + same},
        {{"-r", tree, tree},
         "cannot copy a directory, '" + tree + "', into itself, '" + tree +
             "/tree'; name another destination"},
        {{"-r", tree, tree + "/deep"},
         "cannot copy a directory, '" + tree + "', into itself, '" + tree +
             "/deep'; name another destination"},
        {{"-rT", tree, file},
         "cannot overwrite non-directory '" + file + "' with directory '" + tree +
             "'; move it away"},
        {{file, tree, travel_.To("x")},
         "target '" + travel_.To("x") + "': No such file or directory; check the path"},
        {{file, travel_.To("x/")},
         "cannot create regular file '" + travel_.To("x/") + "': Not a directory; check the path"},
    };
    for (auto [arguments, message] : cases) {
        arguments.insert(arguments.begin(), "cp");
        EXPECT_THAT(travel_.Run(arguments), Failed(1, message)) << message;
    }
    EXPECT_THAT(NamesIn(travel_.target()), ElementsAre());
    EXPECT_THAT(NamesIn(tree), ElementsAre());
    EXPECT_EQ("data", TextOf(file));
}

TEST_F(CpTest, NothingJustMadeIsOverwritten) {
    mkdir(travel_.From("x").c_str(), 0755);
    travel_.MakeFile(travel_.From("x/a"), "second");
    travel_.MakeFile(travel_.From("a"), "first");
    const ToolResult result =
        travel_.Run({"cp", travel_.From("a"), travel_.From("x/a"), travel_.target()});
    EXPECT_THAT(result,
                Failed(1, "will not overwrite just-created '" + travel_.To("a") + "' with '" +
                              travel_.From("x/a") + "'; give it another name"));
    EXPECT_EQ("first", TextOf(travel_.To("a")));
}

TEST_F(CpTest, VerboseSaysWhatGoesWhere) {
    travel_.MakeFile(travel_.From("a\n"));
    const ToolResult result = travel_.Run({"cp", "-v", travel_.From("a\n"), travel_.To("b")});
    EXPECT_EQ("'" + travel_.From("a") + "\\x0A' -> '" + travel_.To("b") + "'\n", result.out);
}

TEST_F(CpTest, JsonHasTheCounts) {
    travel_.MakeFile(travel_.From("a"));
    travel_.MakeFile(travel_.To("a"));
    travel_.MakeFile(travel_.From("b"));
    const ToolResult result = travel_.Run({"--json", "cp", "-n", travel_.From("a"),
                                           travel_.From("b"), travel_.From("c"), travel_.target()});
    EXPECT_EQ(1, result.status);
    const auto json = result.json();
    EXPECT_EQ("copying", json["task"]);
    EXPECT_EQ(1, json["done"]);
    EXPECT_EQ(1, json["skipped"]);
    EXPECT_EQ(4, json["bytes"]);
    EXPECT_EQ(1, json["failed"]);
    EXPECT_EQ(false, json["interrupted"]);
    EXPECT_EQ(travel_.From("c"), json["failures"][0]["path"]);
}

TEST_F(CpTest, AFailureInATreeDoesNotStopTheRest) {
    mkdir(travel_.From("tree").c_str(), 0755);
    for (const char* name : {"tree/a", "tree/b", "tree/c"}) travel_.MakeFile(travel_.From(name));
    mkdir(travel_.To("tree").c_str(), 0755);
    mkdir(travel_.To("tree/b").c_str(), 0755);
    const ToolResult result = travel_.Run({"cp", "-rv", travel_.From("tree"), travel_.target()});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.out, HasSubstr("\n3 copied (8 bytes), 1 failed\n"));
    EXPECT_EQ("mavoea: cannot overwrite directory '" + travel_.To("tree/b") +
                  "' with non-directory; move it away\n",
              result.err);
    EXPECT_EQ("data", TextOf(travel_.To("tree/a")));
    EXPECT_EQ("data", TextOf(travel_.To("tree/c")));
}

TEST_F(CpTest, TheMetadataOfADirectoryThatIsMergedStays) {
    mkdir(travel_.From("tree").c_str(), 0755);
    mkdir(travel_.To("tree").c_str(), 0755);
    travel_.MakeFile(travel_.To("tree/kept"));
    travel_.GiveMetadata(travel_.To("tree"));
    travel_.GiveMetadata(travel_.To("tree/kept"));
    EXPECT_THAT(travel_.Run({"cp", "-r", travel_.From("tree"), travel_.target()}), Succeeded());
    travel_.ExpectMetadata(travel_.To("tree"));
    travel_.ExpectMetadata(travel_.To("tree/kept"));
}

TEST_F(CpTest, WhatMayNotBeWrittenIsToldAndLeft) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    travel_.MakeFile(travel_.From("a"), "new");
    travel_.MakeFile(travel_.To("a"), "old");
    ASSERT_EQ(0, chmod(travel_.To("a").c_str(), 0444));
    for (const std::string& path : {travel_.dir().path(), travel_.source(), travel_.target()}) {
        ASSERT_EQ(0, chmod(path.c_str(), 0777));
    }
    AsUser(1234, Root::kGivenUp, [&] {
        EXPECT_THAT(travel_.Run({"cp", travel_.From("a"), travel_.To("a")}),
                    Failed(1, CannotCreate(travel_.To("a"))));
        EXPECT_EQ("old", TextOf(travel_.To("a")));
        EXPECT_THAT(travel_.Run({"cp", "-f", travel_.From("a"), travel_.To("a")}), Succeeded());
        EXPECT_EQ("new", TextOf(travel_.To("a")));
    });
    ASSERT_EQ(0, chmod(travel_.target().c_str(), 0555));
    AsUser(1234, Root::kGivenUp, [&] {
        EXPECT_THAT(travel_.Run({"cp", travel_.From("a"), travel_.To("b")}),
                    Failed(1, CannotCreate(travel_.To("b"))));
    });
    EXPECT_THAT(NamesIn(travel_.target()), ElementsAre("a"));
}

TEST_F(CpTest, AnotherUsersProgramLosesItsRights) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    travel_.MakeFile(travel_.From("a"));
    ASSERT_EQ(0, chmod(travel_.From("a").c_str(), 06755));
    for (const std::string& path : {travel_.dir().path(), travel_.source(), travel_.target()}) {
        ASSERT_EQ(0, chmod(path.c_str(), 0777));
    }
    AsUser(1234, Root::kGivenUp, [&] {
        EXPECT_THAT(travel_.Run({"cp", travel_.From("a"), travel_.To("a")}), Succeeded());
        EXPECT_THAT(travel_.Run({"cp", "-p", travel_.From("a"), travel_.To("b")}), Succeeded());
    });
    EXPECT_EQ(0755, ModeOf(travel_.To("a")));
    EXPECT_EQ(0755, ModeOf(travel_.To("b")));
}

// Promise: "The tool: `cp`, `convert`, `carry` |"
TEST_F(CpTest, OnAFullDiskTheTargetOfAnAtomicCopyIsAsItWas) {
    const SecondVolume small("size=64k", true);
    MAVOEA_SKIP_WITHOUT_SECOND(small);
    for (const char* option : {"--atomic", "--remove-destination"}) {
        SCOPED_TRACE(option);
        const Travel travel(kEaDirectory, kEaDirectory, small.path());
        travel.MakeFile(travel.From("a"), std::string(100000, 'x'));
        travel.MakeFile(travel.To("a"), "old");
        travel.GiveMetadata(travel.To("a"));
        const ToolResult result = travel.Run({"cp", option, travel.From("a"), travel.To("a")});
        EXPECT_EQ(1, result.status);
        EXPECT_THAT(result.err, HasSubstr("'" + travel.To("a") + "': No space left on device"));
        EXPECT_EQ("old", TextOf(travel.To("a")));
        travel.ExpectMetadata(travel.To("a"));
        EXPECT_THAT(NamesIn(travel.target()), ElementsAre("@eaDir", "a"));
        std::filesystem::remove_all(travel.target());
    }
}

// Promise: "The tool: only data that"
TEST_F(CpTest, OnAFullDiskWhatIsWrittenOverHasTheBeginning) {
    const SecondVolume small("size=64k", true);
    MAVOEA_SKIP_WITHOUT_SECOND(small);
    const Travel travel(kEaDirectory, kEaDirectory, small.path());
    const std::string data(100000, 'x');
    travel.MakeFile(travel.From("a"), data);
    travel.MakeFile(travel.To("a"), "old");
    travel.GiveMetadata(travel.To("a"));
    const ToolResult result = travel.Run({"cp", travel.From("a"), travel.To("a")});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.err, HasSubstr(travel.To("a")));
    EXPECT_THAT(result.err, HasSubstr(": No space left on device"));
    const std::string written = TextOf(travel.To("a"));
    EXPECT_GT(data.size(), written.size());
    EXPECT_TRUE(data.starts_with(written));
    EXPECT_THAT(NamesIn(travel.target()), ElementsAre("@eaDir", "a"));
    EXPECT_EQ(data, TextOf(travel.From("a")));
}

TEST_F(CpTest, MetadataForWhichThereIsNoRoomIsAFailure) {
    const SecondVolume small("size=64k", true);
    MAVOEA_SKIP_WITHOUT_SECOND(small);
    const Travel travel(kEaDirectory, kEaDirectory, small.path());
    travel.MakeFile(travel.From("a"));
    const std::string big(100000, 'f');
    ASSERT_EQ(0, travel.Run({"set", travel.From("a"), "com.apple.ResourceFork"}, big).status);
    const ToolResult result = travel.Run({"cp", travel.From("a"), travel.To("a")});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("its metadata could not be copied"));
    EXPECT_THAT(result.err, HasSubstr("No space left on device"));
}

TEST_F(CpTest, MetadataThatAVolumeDoesNotKeepIsNamedAndTheDataIsThere) {
    const Travel travel(kEaDirectory, 4);
    travel.MakeFile(travel.From("a"));
    travel.GiveMetadata(travel.From("a"));
    travel.MakeFile(travel.From("plain"));
    const ToolResult result = travel.Run({"cp", travel.From("a"), travel.To("a")});
    EXPECT_EQ(2, result.status);
    const std::string why = " (volumes of type 4 keep no metadata)";
    EXPECT_EQ("mavoea: " + travel.From("a") + ": not all of its metadata arrived at " +
                  travel.To("a") + ": \"user.colour\"" + why + ", Finder info" + why +
                  ", resource fork" + why + "; keep the original, or take the rest along by hand\n",
              result.err);
    EXPECT_EQ("data", TextOf(travel.To("a")));
    EXPECT_THAT(NamesIn(travel.target()), ElementsAre("a"));
    travel.ExpectMetadata(travel.From("a"));
    EXPECT_THAT(travel.Run({"cp", travel.From("plain"), travel.To("plain")}), Succeeded());
}

TEST_F(CpTest, MetadataThatANameIsTooLongForIsNamedAndTheDataIsThere) {
    const Travel travel(kXattr, kAppleDouble);
    const std::string name(254, 'n');
    travel.MakeFile(travel.From(name));
    travel.GiveMetadata(travel.From(name));
    const ToolResult result = travel.Run({"cp", travel.From(name), travel.target()});
    EXPECT_EQ(2, result.status);
    EXPECT_EQ("mavoea: " + travel.From(name) + ": not all of its metadata arrived at " +
                  travel.To(name) +
                  ": \"user.colour\" (its name is too long for a \"._\" file); keep the original, "
                  "or take the rest along by hand\n",
              result.err);
    EXPECT_EQ("data", TextOf(travel.To(name)));
    EXPECT_THAT(NamesIn(travel.target()), ElementsAre(name));
    travel.ExpectMetadata(travel.From(name));
}

TEST_F(CpTest, AnInterruptEndsTheWorkBetweenObjects) {
    for (const int number : {SIGINT, SIGTERM}) {
        const Travel travel(kEaDirectory, kAppleDouble);
        for (const char* name : {"a", "b", "c"}) {
            travel.MakeFile(travel.From(name), std::string("new ") + name);
            travel.GiveMetadata(travel.From(name), name);
            travel.MakeFile(travel.To(name), "old");
        }
        RunningTool tool(travel.WithVolumes(
            {"cp", "-i", travel.From("a"), travel.From("b"), travel.From("c"), travel.target()}));
        ASSERT_TRUE(tool.WaitFor("overwrite '" + travel.To("a") + "'? "));
        tool.Answer("y\n");
        ASSERT_TRUE(tool.WaitFor("overwrite '" + travel.To("b") + "'? "));
        tool.Signal(number);
        EXPECT_EQ(128 + number, tool.Wait());
        EXPECT_THAT(tool.said(), HasSubstr("interrupted: 1 copied (5 bytes), 0 failed"));
        EXPECT_EQ("new a", TextOf(travel.To("a")));
        travel.ExpectMetadata(travel.To("a"), "a");
        EXPECT_EQ("old", TextOf(travel.To("b")));
        EXPECT_EQ("old", TextOf(travel.To("c")));
        EXPECT_THAT(Travel::ObjectsIn(travel.target()), ElementsAre("a", "b", "c"));
    }
}

TEST_F(CpTest, TheObjectInHandIsFinished) {
    ASSERT_EQ(0, mkfifo(travel_.From("fifo").c_str(), 0600));
    travel_.MakeFile(travel_.From("z"));
    RunningTool tool(
        travel_.WithVolumes({"cp", travel_.From("fifo"), travel_.From("z"), travel_.target()}));
    const int fd = open(travel_.From("fifo").c_str(), O_WRONLY);  // waits for the reader
    ASSERT_EQ(5, write(fd, "begin", 5));
    tool.Signal(SIGINT);
    ASSERT_EQ(3, write(fd, "end", 3));
    close(fd);
    EXPECT_EQ(130, tool.Wait());
    EXPECT_THAT(tool.said(), HasSubstr("interrupted: 1 copied (8 bytes), 0 failed"));
    EXPECT_EQ("beginend", TextOf(travel_.To("fifo")));
    EXPECT_THAT(Travel::ObjectsIn(travel_.target()), ElementsAre("fifo"));
}

TEST_F(CpTest, ASecondInterruptGivesTheObjectInHandUp) {
    ASSERT_EQ(0, mkfifo(travel_.From("fifo").c_str(), 0600));
    const auto text_after = [&](const Arguments& options) {
        travel_.MakeFile(travel_.To("fifo"), "old");
        Arguments arguments = {"cp", travel_.From("fifo"), travel_.target()};
        arguments.insert(arguments.end(), options.begin(), options.end());
        RunningTool tool(travel_.WithVolumes(arguments));
        const int fd = open(travel_.From("fifo").c_str(), O_WRONLY);
        EXPECT_EQ(5, write(fd, "begin", 5));
        tool.Signal(SIGINT);
        tool.Signal(SIGTERM);
        EXPECT_EQ(130, tool.Wait());
        close(fd);
        EXPECT_THAT(tool.said(), HasSubstr("interrupted"));
        EXPECT_THAT(NamesIn(travel_.target()), ElementsAre("fifo"));
        return TextOf(travel_.To("fifo"));
    };
    EXPECT_EQ("old", text_after({"--atomic"}));
    // What was written over has what had come.
    EXPECT_THAT(text_after({}), AnyOf("begin", ""));
}

}  // namespace
}  // namespace mavoea::test

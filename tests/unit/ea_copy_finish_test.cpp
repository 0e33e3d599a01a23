// What follows a copy of metadata: the source of a move is cleaned, the other files of the EA
// directory are carried over; and the preparation of EA directories at the destination.

#include <errno.h>
#include <gmock/gmock.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "ops/ea_copy.h"
#include "tests/support/copy_world.h"

namespace mavoea::test {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::UnorderedElementsAre;

constexpr char kUnit[] = "ea_copy.c";
constexpr char kThumbToThumb[] = "src/@eaDir/object/MAVOThumb, dst/@eaDir/object/MAVOThumb)";
constexpr char kCpThumb[] =
    "Failed to cp -f src/@eaDir/object/MAVOThumb to "
    "dst/@eaDir/object/MAVOThumb. ";

using Argv = std::vector<std::string>;

class CopyFinishTest : public ::testing::Test {
 protected:
    // Only what the folder holds is of interest, so the object has nothing else; and its type is
    // one whose folders are not taken for a legacy layout.
    CopyFinishTest() {
        world_.ClearAttributes(world_.src());
        for (const char* name : {kAppleDoubleFile, kResourceFile, kStreamFile}) {
            world_.Remove(std::string("src/") + name);
        }
    }

    int Copy() { return world_.Copy({.src_type = 7, .dst_type = 1}); }
    int Move() { return world_.Copy({.move = 1, .src_type = 7, .dst_type = 1}); }

    // Commands that run here, but for `program`, whose every run on a path that ends in `suffix`
    // gives `result`, with errno of EIO.
    static void FailExec(const std::string& program, int result, const std::string& suffix = "") {
        Platform().exec = [=](const Argv& argv) {
            if (argv[0] != program || !argv[2].ends_with(suffix)) return CopyWorld::RunHere(argv);
            errno = EIO;
            return result;
        };
    }
    std::vector<std::string> TakeCommands() {
        std::vector<std::string> calls = world_.TakePlatform();
        std::erase_if(calls,
                      [](const std::string& call) { return !call.starts_with("MLIBCExec"); });
        return calls;
    }
    // Of files; those of the directories that are made are left out.
    std::vector<std::string> TakeChmods() {
        std::vector<std::string> calls = world_.TakeKernel();
        std::erase_if(calls, [](const std::string& call) {
            return call.find("chmod(") == std::string::npos ||
                   call.find("/object/") == std::string::npos;
        });
        return calls;
    }
    static std::string Line(const std::string& text, int error = EIO) {
        return "ea_copy.c:LINE " + text + strerror(error);
    }
    void ExpectFinished() { EXPECT_THAT(world_.archived, ElementsAre("dst/object")); }

    CopyWorld world_;
};

// ---- The source's own files ---------------------------------------------------------------------

// What the copy has removed is put back before the lock is carried, so that it is seen who removes
// it again.
class SourceFilesTest : public ::testing::Test {
 protected:
    static void PutBack(const CopyWorld& world, const char* name) {
        Hooks().before = [&world, name, done = false](const std::string& call) mutable {
            if (done || call != "chmod" || Has(world, name)) return;
            world.Put(std::string("src/") + name, Ascii("again"));
            done = true;
        };
    }
    static bool Has(const CopyWorld& world, const char* name) {
        return world.Has(std::string("src/") + name);
    }
};

TEST_F(SourceFilesTest, AMoveToAppleDoubleRemovesTheResourceFileWhateverTheTypeOfEADirectory) {
    for (const int type : {1, 3, 6, 10}) {
        for (const int move : {1, 2}) {
            SCOPED_TRACE(type);
            CopyWorld world;
            PutBack(world, kResourceFile);
            EXPECT_EQ(0, world.Copy({.move = move, .src_type = type, .dst_type = 0}));
            EXPECT_FALSE(Has(world, kResourceFile));
            ExpectNothingReported();
        }
    }
}

TEST_F(SourceFilesTest, AResourceFileThatCannotBeUnlinkedIsRecordedAndNoFailure) {
    for (const auto& [src, dst] : {std::pair{1, 0}, {3, 5}, {2, 0}, {7, 0}, {0, 1}, {5, 7}}) {
        SCOPED_TRACE(::testing::Message() << src << " to " << dst);
        CopyWorld world;
        EXPECT_EQ(0, world.Copy({.move = 2, .src_type = src, .dst_type = dst}));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, kUnit)));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_THAT(world.archived, ElementsAre("dst/object"));
    }
}

TEST_F(SourceFilesTest, BetweenVolumesWithoutAppleDoubleFilesTheResourceFileIsKept) {
    for (const auto& [src, dst] : {std::pair{1, 7}, {2, 7}, {7, 7}}) {
        SCOPED_TRACE(src);
        CopyWorld world;
        PutBack(world, kResourceFile);
        EXPECT_EQ(0, world.Copy({.move = 2, .src_type = src, .dst_type = dst}));
        EXPECT_TRUE(Has(world, kResourceFile));
        ExpectNothingReported();
    }
}

TEST_F(SourceFilesTest, OnlyTypes1And10HaveTheStreamAndTheFolderRemovedByAMoveToAppleDouble) {
    for (const int type : {1, 3, 6, 10, 2}) {
        for (const int copy_eadir : {0, 1}) {
            SCOPED_TRACE(::testing::Message() << type << ", copyEADir " << copy_eadir);
            CopyWorld world;
            PutBack(world, kStreamFile);
            EXPECT_EQ(
                0,
                world.Copy({.move = 1, .copy_eadir = copy_eadir, .src_type = type, .dst_type = 0}));
            const bool known = type == 1 || type == 10;
            EXPECT_EQ(!known, Has(world, kStreamFile));
            EXPECT_EQ(copy_eadir == 0 && !known, Has(world, kThumb));
            EXPECT_EQ(copy_eadir == 1, world.Has("dst/@eaDir/object/MAVOThumb"));
            EXPECT_EQ(!known, world.Has("src/@eaDir"));
        }
    }
}

TEST_F(SourceFilesTest, AStreamThatIsNotThereInAnyLayoutIsNotRemoved) {
    CopyWorld world;
    world.Remove("src/._object");
    world.Remove("src/@eaDir/object/sub");
    EXPECT_EQ(0, world.Copy({.move = 1, .src_type = 1, .dst_type = 0}));
    const auto calls = world.TakeKernel();
    EXPECT_EQ(1, std::ranges::count(calls, "unlink(src/@eaDir/object@MavoEAStream)"));
}

TEST_F(SourceFilesTest, AFolderThatCannotBeRemovedIsLogged) {
    CopyWorld world;
    Platform().exec = [](const Argv&) {
        errno = EBUSY;
        return -1;
    };
    EXPECT_EQ(0, world.Copy({.move = 1, .src_type = 10, .dst_type = 0}));
    EXPECT_THAT(world.TakeLines(),
                ElementsAre(std::string("ea_copy.c:LINE Failed to rm -rf src/@eaDir/object. ") +
                            strerror(EBUSY)));
    EXPECT_TRUE(world.Has("src/@eaDir/object/MAVOThumb"));
    EXPECT_THAT(world.archived, ElementsAre("dst/object"));
}

TEST_F(SourceFilesTest, APositiveResultOfRmIsNoFailure) {
    CopyWorld world;
    Platform().exec = [](const Argv&) { return 1; };
    EXPECT_EQ(0, world.Copy({.move = 1, .src_type = 1, .dst_type = 0}));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(SourceFilesTest, ACopyRemovesNothing) {
    for (const int src : {0, 1, 3, 6, 7, 10}) {
        for (const int dst : {0, 1, 2, 7}) {
            CopyWorld world;
            const Side before = world.SideAt("src");
            EXPECT_EQ(0, world.Copy({.copy_eadir = 1, .src_type = src, .dst_type = dst}));
            EXPECT_EQ(before, world.SideAt("src"));
        }
    }
}

// ---- Whether the folder is carried over ---------------------------------------------------------

// Promise: "MAVOEACopyEx: Carries"
// Promise: "MAVOEACopyEx: copyEADir not 0"
TEST_F(CopyFinishTest, BesideAppleDoubleVolumesTheFolderIsCarriedOnlyWhenAskedFor) {
    for (const auto& [src, dst] : {std::pair{0, 0}, {0, 1}, {5, 7}, {3, 0}, {7, 0}, {2, 5}}) {
        SCOPED_TRACE(::testing::Message() << src << " to " << dst);
        CopyWorld world;
        EXPECT_EQ(0, world.Copy({.src_type = src, .dst_type = dst}));
        EXPECT_FALSE(world.Has("dst/@eaDir/object"));
        EXPECT_EQ(0, world.Copy({.copy_eadir = 3, .src_type = src, .dst_type = dst}));
        EXPECT_EQ(Ascii("thumb"), ReadFile(world / "dst/@eaDir/object/MAVOThumb"));
    }
}

// Promise: "MAVOEACopyEx: between volumes none"
TEST_F(CopyFinishTest, ElsewhereItAlwaysIs) {
    for (const auto& [src, dst] : {std::pair{1, 1}, {1, 12}, {2, 2}, {7, 7}, {7, 2}, {2, 7}}) {
        SCOPED_TRACE(::testing::Message() << src << " to " << dst);
        CopyWorld world;
        EXPECT_EQ(0, world.Copy({.src_type = src, .dst_type = dst}));
        EXPECT_EQ(Ascii("thumb"), ReadFile(world / "dst/@eaDir/object/MAVOThumb"));
    }
}

TEST_F(CopyFinishTest, ASourceWhoseFolderHasNoPathEndsIt) {
    // Long enough for the "._" file only.
    std::string src = world_.src();
    while (src.size() < 4089) src.insert(src.rfind('/'), src.size() % 2 == 0 ? "/" : "/.");
    for (const int move : {0, 1}) {
        std::string dst = world_.dst();
        EXPECT_EQ(0,
                  CopyWorld::CopyPaths(
                      src.c_str(), dst.data(),
                      {.move = move, .copy_eadir = 1, .src_type = 0, .dst_type = 0, .index = 1}));
        const auto records = TakeRecords();
        ASSERT_FALSE(records.empty());
        EXPECT_THAT(records.back(), RecordOf(0xC300, "ea_dir_path"));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_THAT(world_.archived, IsEmpty());
        EXPECT_THAT(world_.TakePlatform(), Contains(::testing::StartsWith("MLIBMavoIndexAddEx")));
    }
    EXPECT_FALSE(world_.Has("dst/@eaDir"));
}

TEST_F(CopyFinishTest, ASourceWithoutAFolderHasNothingToCarry) {
    world_.Remove("src/@eaDir/object");
    world_.Put("dst/@eaDir/object/old", Ascii("old"));
    EXPECT_EQ(0, Copy());
    EXPECT_TRUE(world_.Has("src/@eaDir"));
    EXPECT_TRUE(world_.Has("dst/@eaDir/object/old"));
    EXPECT_THAT(TakeCommands(), IsEmpty());
    ExpectFinished();
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, AMoveWithoutAFolderStillRemovesTheEmptyEADirectory) {
    world_.Remove("src/@eaDir/object");
    EXPECT_EQ(0, Move());
    EXPECT_FALSE(world_.Has("src/@eaDir"));
    EXPECT_FALSE(world_.Has("dst/@eaDir"));
    EXPECT_THAT(TakeCommands(), IsEmpty());
    ExpectFinished();
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, AFileInTheFoldersPlaceIsNoFolder) {
    world_.Remove("src/@eaDir/object");
    world_.Put("src/@eaDir/object", Ascii("file"));
    EXPECT_EQ(0, Move());
    EXPECT_EQ(Ascii("file"), ReadFile(world_ / "src/@eaDir/object"));
    EXPECT_FALSE(world_.Has("dst/@eaDir"));
    ExpectFinished();
}

TEST_F(CopyFinishTest, AFolderThatCannotBeOpenedIsLoggedAndLeft) {
    for (const int move : {0, 1}) {
        const FailCall fault("opendir", EACCES);
        EXPECT_EQ(0, world_.Copy({.move = move, .src_type = 7, .dst_type = 1, .index = 1}));
        EXPECT_TRUE(fault.fired());
        EXPECT_THAT(world_.TakeLines(),
                    ElementsAre(std::string("ea_copy.c:LINE Failed to opendir src/@eaDir/object, "
                                            "reason = ") +
                                strerror(EACCES) + "."));
        EXPECT_THAT(world_.TakePlatform(), Contains(::testing::StartsWith("MLIBMavoIndexAddEx")));
        EXPECT_TRUE(world_.Has("src/@eaDir/object/MAVOThumb"));
        EXPECT_THAT(NamesIn(world_ / "dst/@eaDir/object"), IsEmpty());
        EXPECT_THAT(world_.archived, IsEmpty());
    }
}

// ---- The destination's folder -------------------------------------------------------------------

// Promise: "MAVOEACopyEx: between volumes none"
TEST_F(CopyFinishTest, AFolderAtTheDestinationIsReplaced) {
    world_.Put("dst/@eaDir/object/old", Ascii("old"));
    world_.Put("dst/@eaDir/other/file", Ascii("other"));
    EXPECT_EQ(0, Copy());
    EXPECT_THAT(NamesIn(world_ / "dst/@eaDir/object"), ElementsAre("MAVOThumb"));
    EXPECT_TRUE(world_.Has("dst/@eaDir/other/file"));
    EXPECT_THAT(
        world_.TakePlatform(),
        ElementsAre("MLIBCExec(/bin/rm, -rf, dst/@eaDir/object)",
                    "MAVOGetFSType(dst/@eaDir/object, 0)", "MAVOACLSetEADirACL(dst/@eaDir/object)",
                    std::string("MLIBCExec(/bin/cp, -f, ") + kThumbToThumb));
    ExpectFinished();
}

TEST_F(CopyFinishTest, ACopyWhoseDestinationFolderCannotBePreparedEndsThere) {
    world_.Put("dst/@eaDir/object/old", Ascii("old"));
    FailExec("/bin/rm", -1);
    EXPECT_EQ(0, world_.Copy({.src_type = 7, .dst_type = 1, .file_index = 1, .index = 1}));
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre("ea_copy.c:LINE Failed to rm -rf dst/@eaDir/object."));
    EXPECT_THAT(world_.TakePlatform(), ElementsAre("MLIBCExec(/bin/rm, -rf, dst/@eaDir/object)",
                                                   "MLIBMavoIndexAddEx(dst/object, NULL, 1, 0, 0)",
                                                   "MLIBMavoFileIndexAdd(dst/object, NULL, 1)"));
    EXPECT_TRUE(world_.Has("src/@eaDir/object/MAVOThumb"));
    EXPECT_TRUE(world_.Has("dst/@eaDir/object/old"));
    EXPECT_THAT(world_.archived, IsEmpty());
}

TEST_F(CopyFinishTest, AMoveWhoseDestinationFolderCannotBePreparedLosesTheFilesAndTellsTheIndexes) {
    for (const int file_index : {0, 1}) {
        for (const int index : {0, 1}) {
            CopyWorld world;
            const FailCall fault("mkdir", EROFS, 0);
            EXPECT_EQ(0, world.Copy({.move = 1,
                                     .copy_eadir = 1,
                                     .src_type = 0,
                                     .dst_type = 0,
                                     .file_index = file_index,
                                     .index = index}));
            std::vector<std::string> expected = {
                "MLIBCExec(/bin/cp, -f, src/._object, dst/._object)",
                "MLIBCExec(/bin/rm, -rf, src/@eaDir/object)"};
            if (index != 0) {
                expected.emplace_back("MLIBMavoIndexAddEx(dst/object, NULL, 2, 0, 0)");
            }
            if (file_index != 0) {
                expected.emplace_back("MLIBMavoFileIndexAdd(src/object, NULL, 2)");
            }
            if (index != 0) {
                expected.emplace_back("MLIBMavoIndexAddEx(dst/object, src/object, 4, 0, 0)");
            }
            if (file_index != 0) {
                expected.emplace_back("MLIBMavoFileIndexAdd(src/object, NULL, 6)");
                expected.emplace_back("MLIBMavoFileIndexAdd(dst/object, NULL, 3)");
            }
            EXPECT_EQ(expected, world.TakePlatform());
            EXPECT_FALSE(world.Has("src/@eaDir/object"));
            EXPECT_TRUE(world.Has("src/@eaDir/object@MavoResource"));
            EXPECT_THAT(world.archived, IsEmpty());
            EXPECT_THAT(world.TakeLines(), IsEmpty());
        }
    }
}

TEST_F(CopyFinishTest, AMoveThatLosesTheFilesCleansTheEmptyEADirectory) {
    world_.Put("dst/@eaDir/object/old", Ascii("old"));
    FailExec("/bin/rm", -1, "dst/@eaDir/object");
    EXPECT_EQ(0, Move());
    EXPECT_FALSE(world_.Has("src/@eaDir"));
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre("ea_copy.c:LINE Failed to rm -rf dst/@eaDir/object."));
    EXPECT_THAT(TakeCommands(), ElementsAre("MLIBCExec(/bin/rm, -rf, dst/@eaDir/object)",
                                            "MLIBCExec(/bin/rm, -rf, src/@eaDir/object)"));
    EXPECT_THAT(world_.archived, IsEmpty());
}

TEST_F(CopyFinishTest, AMoveThatCannotEvenLoseTheFilesSaysSo) {
    world_.Put("dst/@eaDir/object/old", Ascii("old"));
    FailExec("/bin/rm", -1);
    EXPECT_EQ(0, world_.Copy({.move = 1, .src_type = 7, .dst_type = 1, .index = 1}));
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre("ea_copy.c:LINE Failed to rm -rf dst/@eaDir/object.",
                            Line("Failed to rm -rf src/@eaDir/object. ")));
    EXPECT_TRUE(world_.Has("src/@eaDir/object/MAVOThumb"));
    EXPECT_THAT(world_.TakePlatform(), Contains("MLIBMavoIndexAddEx(dst/object, NULL, 2, 0, 0)"));
}

TEST_F(CopyFinishTest, ADestinationWhoseFolderHasNoPathCannotBePrepared) {
    std::string dst = world_.dst();
    while (dst.size() < 4089) dst.insert(dst.rfind('/'), dst.size() % 2 == 0 ? "/" : "/.");
    Platform().exec = [](const Argv&) { return 0; };
    EXPECT_EQ(0, CopyWorld::CopyPaths(world_.src().c_str(), dst.data(),
                                      {.copy_eadir = 1, .src_type = 0, .dst_type = 0}));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_copy.c:LINE Failed to get EA path of " + dst + "."));
    EXPECT_THAT(world_.archived, IsEmpty());
}

// ---- The entries --------------------------------------------------------------------------------

TEST_F(CopyFinishTest, OnlyRegularFilesAreCarriedOver) {
    world_.Put("src/@eaDir/object/plain", Ascii("plain"));
    world_.Put("src/@eaDir/object/empty", {});
    ASSERT_EQ(0, symlink("plain", (world_ / "src/@eaDir/object/link").c_str()));
    ASSERT_EQ(0, symlink("nowhere", (world_ / "src/@eaDir/object/dangling").c_str()));
    ASSERT_EQ(0, mkfifo((world_ / "src/@eaDir/object/fifo").c_str(), 0666));
    const Side before = world_.SideAt("src");
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(before, world_.SideAt("src"));
    EXPECT_THAT(NamesIn(world_ / "dst/@eaDir/object"), ElementsAre("MAVOThumb", "empty", "plain"));
    EXPECT_EQ(Ascii("plain"), ReadFile(world_ / "dst/@eaDir/object/plain"));
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, AMoveRemovesWhateverElseIsInTheFolder) {
    ASSERT_EQ(0, symlink("MAVOThumb", (world_ / "src/@eaDir/object/link").c_str()));
    ASSERT_EQ(0, symlink("nowhere", (world_ / "src/@eaDir/object/dangling").c_str()));
    ASSERT_EQ(0, mkfifo((world_ / "src/@eaDir/object/fifo").c_str(), 0666));
    EXPECT_EQ(0, Move());
    EXPECT_THAT(NamesIn(world_ / "dst/@eaDir/object"), ElementsAre("MAVOThumb"));
    EXPECT_FALSE(world_.Has("src/@eaDir"));
    const auto commands = TakeCommands();
    EXPECT_THAT(commands, Contains("MLIBCExec(/bin/rm, -rf, src/@eaDir/object/sub)"));
    EXPECT_THAT(commands, Contains("MLIBCExec(/bin/rm, -rf, src/@eaDir/object/fifo)"));
    // What access() does not find is left to the removal of the whole.
    EXPECT_THAT(commands, Not(Contains("MLIBCExec(/bin/rm, -rf, src/@eaDir/object/dangling)")));
    EXPECT_EQ("MLIBCExec(/bin/rm, -rf, src/@eaDir/object)", commands.back());
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, CarriedFilesCanBeUsedByEverybody) {
    const Umask umask(077);
    ASSERT_EQ(0, chmod((world_ / "src/@eaDir/object/MAVOThumb").c_str(), 0400));
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir/object/MAVOThumb"));
    EXPECT_EQ(0400, ModeOf(world_ / "src/@eaDir/object/MAVOThumb"));
    EXPECT_THAT(TakeChmods(), ElementsAre("fchmod(dst/@eaDir/object/MAVOThumb, 0777)"));
}

TEST_F(CopyFinishTest, AModeThatCannotBeSetIsIgnored) {
    const FailCall fault("fchmod", EPERM, 3);  // after those of both directories
    EXPECT_EQ(0, Copy());
    EXPECT_TRUE(fault.fired());
    ExpectFinished();
    ExpectNothingReported();
}

// Promise: "MAVOEACopyEx: NULL runs"
TEST_F(CopyFinishTest, AMoveRunsMvAndThenCpOfTheMissingFile) {
    EXPECT_EQ(0, Move());
    auto commands = TakeCommands();
    std::erase_if(commands, [](const std::string& call) { return call.ends_with("sub)"); });
    EXPECT_THAT(commands, ElementsAre(std::string("MLIBCExec(/bin/mv, -f, ") + kThumbToThumb,
                                      std::string("MLIBCExec(/bin/cp, -f, ") + kThumbToThumb,
                                      "MLIBCExec(/bin/rm, -rf, src/@eaDir/object)"));
    // cp gave 1, which is no failure.
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir/object/MAVOThumb"));
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, AFailedCpAfterAMvIsLoggedAndLeavesTheMode) {
    ASSERT_EQ(0, chmod((world_ / "src/@eaDir/object/MAVOThumb").c_str(), 0640));
    FailExec("/bin/cp", -1);
    EXPECT_EQ(0, Move());
    EXPECT_THAT(world_.TakeLines(), ElementsAre(Line(kCpThumb)));
    EXPECT_EQ(0640, ModeOf(world_ / "dst/@eaDir/object/MAVOThumb"));
    ExpectFinished();
}

TEST_F(CopyFinishTest, AFailedMvIsLoggedAndTheFileIsLost) {
    for (const int result : {-1, 1}) {
        SCOPED_TRACE(result);
        CopyWorld world;
        FailExec("/bin/mv", result);
        EXPECT_EQ(0, world.Copy({.move = 1, .src_type = 7, .dst_type = 7}));
        EXPECT_THAT(world.TakeLines(), ElementsAre(Line(kCpThumb)));
        const auto calls = world.TakePlatform();
        EXPECT_THAT(calls, Not(Contains(std::string("MLIBCExec(/bin/cp, -f, ") + kThumbToThumb)));
        EXPECT_THAT(calls, Contains("MLIBCExec(/bin/rm, -rf, src/@eaDir/object/MAVOThumb)"));
        EXPECT_THAT(NamesIn(world / "dst/@eaDir/object"), IsEmpty());
        EXPECT_FALSE(world.Has("src/@eaDir/object"));
        for (const std::string& call : world.TakeKernel()) {
            EXPECT_NE("fchmod(dst/@eaDir/object/MAVOThumb, 0777)", call);
        }
        EXPECT_THAT(world.archived, ElementsAre("dst/object"));
    }
}

TEST_F(CopyFinishTest, AFileIsNotCopiedThroughALinkAndTheLineSaysSo) {
    const std::string link = world_ / "dst/@eaDir/object/MAVOThumb";
    Hooks().before = [&link](const std::string& call) {
        if (call == "readdir") (void)!symlink("elsewhere", link.c_str());
    };
    EXPECT_EQ(0, Copy());
    EXPECT_THAT(world_.TakeLines(), ElementsAre(Line(kCpThumb, ELOOP)));
    EXPECT_EQ("elsewhere", std::filesystem::read_symlink(link));
    EXPECT_FALSE(world_.Has("dst/@eaDir/object/elsewhere"));
    ExpectFinished();
}

// Promise: "MAVOEACopyEx: 0 when"
TEST_F(CopyFinishTest, AFailedCpIsLoggedAndTheOthersGoOn) {
    world_.Put("src/@eaDir/object/another", Ascii("another"));
    FailExec("/bin/cp", -1, "MAVOThumb");
    EXPECT_EQ(0, Copy());
    EXPECT_THAT(world_.TakeLines(), ElementsAre(Line(kCpThumb)));
    EXPECT_THAT(NamesIn(world_ / "dst/@eaDir/object"), ElementsAre("another"));
    EXPECT_THAT(TakeChmods(), ElementsAre("fchmod(dst/@eaDir/object/another, 0777)"));
    EXPECT_TRUE(world_.Has("src/@eaDir/object/MAVOThumb"));
    ExpectFinished();
}

TEST_F(CopyFinishTest, APositiveResultOfCpIsNoFailure) {
    FailExec("/bin/cp", 1);
    EXPECT_EQ(0, Copy());
    ExpectFinished();
    ExpectNothingReported();
}

// Promise: "MAVOEACopyEx: copyFn copies"
TEST_F(CopyFinishTest, ACopierStandsInForMvAndCp) {
    world_.Put("src/@eaDir/object/another", Ascii("another"));
    EXPECT_EQ(0, world_.Copy({.move = 1, .src_type = 7, .dst_type = 1, .with_copier = true}));
    EXPECT_THAT(world_.copied,
                UnorderedElementsAre("src/@eaDir/object/MAVOThumb dst/@eaDir/object/MAVOThumb",
                                     "src/@eaDir/object/another dst/@eaDir/object/another"));
    EXPECT_THAT(TakeCommands(),
                UnorderedElementsAre("MLIBCExec(/bin/rm, -rf, src/@eaDir/object/MAVOThumb)",
                                     "MLIBCExec(/bin/rm, -rf, src/@eaDir/object/another)",
                                     "MLIBCExec(/bin/rm, -rf, src/@eaDir/object/sub)",
                                     "MLIBCExec(/bin/rm, -rf, src/@eaDir/object)"));
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir/object/another"));
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, ACopierThatFailsIsLoggedAndAMoveLosesTheFile) {
    world_.copier = [](const std::string&, const std::string&) {
        errno = EDQUOT;
        return -3;
    };
    for (const int move : {0, 1}) {
        EXPECT_EQ(0,
                  world_.Copy({.move = move, .src_type = 7, .dst_type = 1, .with_copier = true}));
        EXPECT_THAT(world_.TakeLines(), ElementsAre(Line(kCpThumb, EDQUOT)));
        EXPECT_THAT(NamesIn(world_ / "dst/@eaDir/object"), IsEmpty());
        EXPECT_EQ(move == 0, world_.Has("src/@eaDir/object/MAVOThumb"));
    }
    for (const std::string& call : TakeChmods()) {
        EXPECT_NE("fchmod(dst/@eaDir/object/MAVOThumb, 0777)", call);
    }
}

// Promise: "MAVOEACopyEx: copyFn copies"
TEST_F(CopyFinishTest, ACopierThatGivesAPositiveResultHasNotFailed) {
    world_.copier = [](const std::string& from, const std::string& to) {
        (void)CopyWorld::CopyOver(from, to);
        return 7;
    };
    EXPECT_EQ(0, world_.Copy({.src_type = 7, .dst_type = 1, .with_copier = true}));
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir/object/MAVOThumb"));
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, EntriesThatCannotBeRemovedAreLogged) {
    FailExec("/bin/rm", -1);
    EXPECT_EQ(0, Move());
    EXPECT_THAT(world_.TakeLines(), ElementsAre(Line("Failed to rm -rf src/@eaDir/object/sub. "),
                                                Line("Failed to rm -rf src/@eaDir/object. ")));
    EXPECT_TRUE(world_.Has("src/@eaDir/object/sub/inner"));
    ExpectFinished();
}

TEST_F(CopyFinishTest, ALongNameIsCarriedAsItIs) {
    const std::string name(255, 'n');
    world_.Put("src/@eaDir/object/" + name, Ascii("long"));
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(Ascii("long"), ReadFile(world_ / ("dst/@eaDir/object/" + name)));
}

// ---- Cleaning -----------------------------------------------------------------------------------

TEST_F(CopyFinishTest, AnEADirectoryThatHoldsMoreIsKept) {
    world_.Put("src/@eaDir/neighbour@MavoEAStream", Ascii("stream"));
    EXPECT_EQ(0, Move());
    EXPECT_THAT(NamesIn(world_ / "src/@eaDir"), ElementsAre("neighbour@MavoEAStream"));
}

TEST_F(CopyFinishTest, ACoverDoesNotKeepAnEADirectory) {
    world_.Put("src/@eaDir/.cover", Ascii("cover"));
    EXPECT_EQ(0, Move());
    EXPECT_FALSE(world_.Has("src/@eaDir"));
}

TEST_F(CopyFinishTest, WithoutAPathInItTheEADirectoryIsNotCleaned) {
    for (const auto& [src, dst] : {std::pair{7, 0}, {2, 5}, {0, 0}, {5, 1}}) {
        SCOPED_TRACE(src);
        CopyWorld world;
        world.Remove("src/@eaDir");
        std::filesystem::create_directory(world / "src/@eaDir");
        world.ClearAttributes(world.src());
        EXPECT_EQ(0, world.Copy({.move = 2, .src_type = src, .dst_type = dst}));
        EXPECT_TRUE(world.Has("src/@eaDir"));
        // The folder is such a path, even if it is missing.
        EXPECT_EQ(0, world.Copy({.move = 2, .copy_eadir = 1, .src_type = src, .dst_type = dst}));
        EXPECT_FALSE(world.Has("src/@eaDir"));
    }
}

TEST_F(CopyFinishTest, TheResourceFileIsSuchAPathToAppleDouble) {
    for (const int type : {1, 3, 6, 10}) {
        SCOPED_TRACE(type);
        CopyWorld world;
        world.Remove("src/@eaDir");
        std::filesystem::create_directory(world / "src/@eaDir");
        EXPECT_EQ(0, world.Copy({.src_type = type, .dst_type = 0}));
        EXPECT_TRUE(world.Has("src/@eaDir"));
        EXPECT_EQ(0, world.Copy({.move = 2, .src_type = type, .dst_type = 0}));
        EXPECT_FALSE(world.Has("src/@eaDir"));
    }
}

TEST_F(CopyFinishTest, AnArchiveBitThatCannotBeSetIsIgnored) {
    world_.archive_result = -1;
    EXPECT_EQ(0, Copy());
    ExpectFinished();
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, TheArchiveBitOfAMissingDestinationIsNotSet) {
    world_.Remove("dst/object");
    EXPECT_EQ(0, Copy());
    EXPECT_THAT(world_.archived, IsEmpty());
    EXPECT_TRUE(world_.Has("dst/@eaDir/object/MAVOThumb"));
    ExpectNothingReported();
}

TEST_F(CopyFinishTest, ADirectorysFolderIsCarriedLikeAFiles) {
    world_.Remove("src/object");
    world_.Remove("dst/object");
    std::filesystem::create_directory(world_ / "src/object");
    std::filesystem::create_directory(world_ / "dst/object");
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(Ascii("thumb"), ReadFile(world_ / "dst/@eaDir/object/MAVOThumb"));
    ExpectFinished();
}

// ---- Preparing an EA directory ------------------------------------------------------------------

class PrepareTest : public ::testing::Test {
 protected:
    int Prepare(int mode) {
        memset(buffer_, '#', sizeof buffer_);
        return EAPrepareEADir(mode, world_.dst().c_str(), buffer_, 4095);
    }
    std::string Path() const { return world_.Short(buffer_); }

    CopyWorld world_;
    char buffer_[4096] = {};
};

TEST_F(PrepareTest, BadArgumentsAreRefusedInSilence) {
    const char* const dst = world_.dst().c_str();
    for (const int mode : {0, 1}) {
        EXPECT_EQ(-1, EAPrepareEADir(mode, nullptr, buffer_, 4095));
        EXPECT_EQ(-1, EAPrepareEADir(mode, dst, nullptr, 4095));
        EXPECT_EQ(-1, EAPrepareEADir(mode, dst, buffer_, 0));
        EXPECT_EQ(-1, EAPrepareEADir(mode, dst, buffer_, -1));
    }
    ExpectNothingReported();
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

TEST_F(PrepareTest, APathThatCannotBeDerivedIsLogged) {
    char small[20];
    for (const int mode : {0, 1}) {
        EXPECT_EQ(-1, EAPrepareEADir(mode, world_.dst().c_str(), small, sizeof small));
        EXPECT_THAT(world_.TakeLines(),
                    ElementsAre("ea_copy.c:LINE Failed to get EA path of dst/object."));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xC300, "ea_dir_path")));
    }
    EXPECT_FALSE(world_.Has("dst/@eaDir"));
}

TEST_F(PrepareTest, AMissingDirectoryIsMadeInTheFormThatTheModeNames) {
    EXPECT_EQ(0, Prepare(1));
    EXPECT_EQ("dst/@eaDir", Path());
    EXPECT_THAT(NamesIn(world_ / "dst"), ElementsAre("@eaDir", "object"));
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir"));
    world_.Remove("dst/@eaDir");
    // The folder, with the directory around it.
    EXPECT_EQ(0, Prepare(0));
    EXPECT_EQ("dst/@eaDir/object", Path());
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir/object"));
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir"));
    ExpectNothingReported();
}

TEST_F(PrepareTest, OnlyAFolderIsMadeWithItsParent) {
    world_.Remove("dst");
    EXPECT_EQ(-1, Prepare(1));
    EXPECT_EQ(-1, Prepare(0));
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0x3C00, "ea_mkdir.c"), RecordOf(0x3C00, "ea_mkdir.c")));
    EXPECT_THAT(world_.TakeLines(), IsEmpty());
}

TEST_F(PrepareTest, ModeOneKeepsADirectoryThatIsThere) {
    world_.Put("dst/@eaDir/file", Ascii("file"));
    EXPECT_EQ(0, Prepare(1));
    EXPECT_EQ("dst/@eaDir", Path());
    EXPECT_TRUE(world_.Has("dst/@eaDir/file"));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

TEST_F(PrepareTest, ModeZeroReplacesAFolderThatIsThere) {
    world_.Put("dst/@eaDir/object/file", Ascii("file"));
    EXPECT_EQ(0, Prepare(0));
    EXPECT_THAT(NamesIn(world_ / "dst/@eaDir/object"), IsEmpty());
    EXPECT_THAT(world_.TakePlatform(), ElementsAre("MLIBCExec(/bin/rm, -rf, dst/@eaDir/object)",
                                                   "MAVOGetFSType(dst/@eaDir/object, 0)",
                                                   "MAVOACLSetEADirACL(dst/@eaDir/object)"));
    ExpectNothingReported();
}

TEST_F(PrepareTest, AFolderThatCannotBeRemovedIsLogged) {
    world_.Put("dst/@eaDir/object/file", Ascii("file"));
    Platform().exec = [](const Argv&) { return -1; };
    EXPECT_EQ(-1, Prepare(0));
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre("ea_copy.c:LINE Failed to rm -rf dst/@eaDir/object."));
    EXPECT_TRUE(world_.Has("dst/@eaDir/object/file"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    // Any other result counts as removed, and a folder that is there needs not be made.
    Platform().exec = [](const Argv&) { return 1; };
    EXPECT_EQ(0, Prepare(0));
    EXPECT_THAT(world_.TakeLines(), IsEmpty());
}

TEST_F(PrepareTest, ADirectoryThatCannotBeMadeFails) {
    {
        const FailCall fault("mkdir", EROFS);
        EXPECT_EQ(-1, Prepare(1));
    }
    {
        const FailCall fault("mkdir", EROFS);
        EXPECT_EQ(-1, Prepare(0));
    }
    EXPECT_FALSE(world_.Has("dst/@eaDir"));
    world_.Put("dst/@eaDir/object/file", Ascii("file"));
    {
        const FailCall fault("mkdir", EROFS);
        EXPECT_EQ(-1, Prepare(0));
    }
    EXPECT_FALSE(world_.Has("dst/@eaDir/object"));
    EXPECT_THAT(world_.TakeLines(), IsEmpty());
}

}  // namespace
}  // namespace mavoea::test

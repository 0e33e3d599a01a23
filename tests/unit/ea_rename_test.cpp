// Metadata that follows its object to a new name: in the EA directory, beside the object, and
// across volumes.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <limits.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <map>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/second_volume.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;
using ::testing::IsSupersetOf;
using ::testing::Not;
using ::testing::StartsWith;

constexpr char kUnit[] = "ea_rename.c";
constexpr uid_t kNobody = 65534;

std::string IndexCall(const ObjectFiles& to, const ObjectFiles& from) {
    return "MLIBMavoIndexAddEx(" + to.object() + ", " + from.object() + ", 4, 0, 0)";
}
std::string FileIndexCall(const ObjectFiles& to, const ObjectFiles& from) {
    return "MLIBMavoFileIndexAdd(" + to.object() + ", " + from.object() + ", 4)";
}
std::string MvCall(const std::string& from, const std::string& to) {
    return "MLIBCExec(/bin/mv, " + from + ", " + to + ")";
}

constexpr bool IsAppleDouble(int type) { return type == 0 || type == 5; }
constexpr bool IsEaDir(int type) {
    return type == 1 || type == 2 || type == 3 || type == 6 || type == 7 || type == 10;
}

// An object "a" in "from" that its caller has renamed: to "b" there, or in "to".
class EaRenameTest : public ::testing::Test, protected Identity {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        MakeDir(old_.parent);
        MakeDir(new_.parent);
        BeUser(0);  // who may make EA directories
        Hooks().archive = [this](int fd) {
            archived_.push_back(
                std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(fd)).string());
            return 0;
        };
        live_blocks_ = TakeAllocations().live;
        descriptors_ = OpenDescriptors();
    }

    void TearDown() override {
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        ResetKernel();
        ResetPlatform();
    }

    static int Rename(const ObjectFiles& from, const ObjectFiles& to, int type = 1) {
        return MAVOEARename(from.object().c_str(), to.object().c_str(), type, nullptr);
    }

    static void ExpectOnly(int code, const std::string& unit) {
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, unit)));
        EXPECT_THAT(TakeLog(), IsEmpty());
    }
    // The calls for the indexes since the last time.
    static std::vector<std::string> TakeReports() {
        std::vector<std::string> calls = TakePlatformCalls();
        std::erase_if(calls, [](const auto& call) {
            return !call.starts_with("MLIBMavoIndexAddEx(") &&
                   !call.starts_with("MLIBMavoFileIndexAdd(");
        });
        return calls;
    }
    static void ExpectBothIndexesTold(const ObjectFiles& from, const ObjectFiles& to) {
        EXPECT_THAT(TakeReports(), ElementsAre(IndexCall(to, from), FileIndexCall(to, from)));
    }
    static std::vector<std::string> TakeExecs() {
        std::vector<std::string> calls = TakePlatformCalls();
        std::erase_if(calls, [](const auto& call) { return !call.starts_with("MLIBCExec("); });
        return calls;
    }
    static std::vector<std::string> TakeRenames() {
        std::vector<std::string> calls = TakeCalls();
        std::erase_if(calls, [](const auto& call) { return !call.starts_with("rename("); });
        return calls;
    }
    static std::string RenameCall(const std::string& from, const std::string& to) {
        return "rename(" + from + ", " + to + ")";
    }

    std::vector<std::string> All() const { return Tree(dir_.path()); }

    // That the metadata of the current layout now at `to` was made for `from`.
    static void ExpectFilesOf(const ObjectFiles& from, const ObjectFiles& to) {
        ASSERT_TRUE(Exists(to.stream()));
        ASSERT_TRUE(Exists(to.resource()));
        EXPECT_EQ(Ascii("stream of " + from.name), ReadFile(to.stream()));
        EXPECT_EQ(Ascii("resource of " + from.name), ReadFile(to.resource()));
        EXPECT_FALSE(Exists(from.stream()));
        EXPECT_FALSE(Exists(from.resource()));
    }
    static void ExpectFolderOf(const ObjectFiles& from, const ObjectFiles& to) {
        ASSERT_TRUE(Exists(to.folder()));
        EXPECT_THAT(NamesIn(to.folder()), ElementsAre("MAVO:Resource", "color"));
        EXPECT_EQ(Ascii("MAVO:Resource of " + from.name), ReadFile(to.folder() + "/MAVO:Resource"));
        EXPECT_EQ(Ascii("color of " + from.name), ReadFile(to.folder() + "/color"));
        EXPECT_FALSE(Exists(from.folder()));
    }

    TempDir dir_;
    const ObjectFiles old_{dir_ / "from", "a"};
    const ObjectFiles beside_{dir_ / "from", "b"};
    const ObjectFiles new_{dir_ / "to", "b"};
    const ObjectFiles other_{dir_ / "from", "other"};
    std::vector<std::string> archived_;
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// ---- By type of volume --------------------------------------------------------------------------

// Every type, given by the caller and found.
class EaRenameByTypeTest : public EaRenameTest,
                           public ::testing::WithParamInterface<std::tuple<int, bool>> {
 protected:
    void SetUp() override {
        EaRenameTest::SetUp();
        // New EA directories are asked about with another flag.
        Platform().fs_type = [](const std::string&, int flag) {
            return flag == 1 ? std::get<0>(GetParam()) : 1;
        };
    }
    static int type() { return std::get<0>(GetParam()); }
    static int argument() { return std::get<1>(GetParam()) ? -1 : type(); }
    static bool Reports() { return IsAppleDouble(type()) || IsEaDir(type()); }
};

INSTANTIATE_TEST_SUITE_P(Of, EaRenameByTypeTest,
                         ::testing::Combine(::testing::Range(0, 14), ::testing::Bool()),
                         [](const auto& about) {
                             return "Type" + std::to_string(std::get<0>(about.param)) +
                                    (std::get<1>(about.param) ? "Found" : "Given");
                         });

// Promise: "MAVOEARename: Moves"
TEST_P(EaRenameByTypeTest, WhatFollowsTheObjectIsWhatTheVolumeKeeps) {
    for (const ObjectFiles& to : {beside_, new_}) {
        SCOPED_TRACE(to.object());
        old_.MakeAll();
        const std::vector<std::string> before = All();
        EXPECT_EQ(0, Rename(old_, to, argument()));
        if (IsAppleDouble(type())) {
            EXPECT_EQ(Ascii("sidecar of a"), ReadFile(to.sidecar()));
            EXPECT_FALSE(Exists(old_.sidecar()));
            ExpectFolderOf(old_, to);
            EXPECT_TRUE(Exists(old_.stream()));
            EXPECT_TRUE(Exists(old_.resource()));
        } else if (IsEaDir(type())) {
            ExpectFilesOf(old_, to);
            ExpectFolderOf(old_, to);
            EXPECT_TRUE(Exists(old_.sidecar()));
        } else {
            EXPECT_EQ(before, All());
        }
        ExpectNothingReported();
        std::filesystem::remove_all(to.ea_dir());
        std::filesystem::remove(to.sidecar());
    }
}

TEST_P(EaRenameByTypeTest, AnObjectWithoutMetadataIsASuccessAndMakesNothing) {
    new_.MakeObject();
    EXPECT_EQ(0, Rename(old_, new_, argument()));
    EXPECT_THAT(All(), ElementsAre("from/", "to/", "to/b"));
    if (Reports()) {
        ExpectBothIndexesTold(old_, new_);
    } else {
        EXPECT_THAT(TakeReports(), IsEmpty());
    }
    if (IsEaDir(type())) {
        EXPECT_THAT(archived_, ElementsAre(new_.object()));
    } else {
        EXPECT_THAT(archived_, IsEmpty());
    }
    ExpectNothingReported();
}

// Promise: "MAVOEARename: the archive bit"
TEST_P(EaRenameByTypeTest, TheArchiveBitIsSetOnTheNewPathOfEaDirectoryVolumes) {
    old_.MakeAll();
    old_.MakeObject();
    beside_.MakeObject();
    TakeCalls();
    EXPECT_EQ(0, Rename(old_, beside_, argument()));
    if (IsEaDir(type())) {
        EXPECT_THAT(archived_, ElementsAre(beside_.object()));
        EXPECT_THAT(TakeCalls(), Contains("archive()"));
    } else {
        EXPECT_THAT(archived_, IsEmpty());
        EXPECT_THAT(TakeCalls(), Not(Contains("archive()")));
    }
}

// Promise: "EAIndexFlags: a NULL pointer means both"
// Promise: "MAVOIndex: op is"
// Promise: "Remove, rename and copy: the platform's indexes"
TEST_P(EaRenameByTypeTest, EachSettingOfTheOptionsTellsTheIndexesThatItSays) {
    for (const int file_index : {-1, 0, 1, 2}) {
        for (const int index : {-1, 0, 1, 2}) {
            SCOPED_TRACE(std::to_string(file_index) + " " + std::to_string(index));
            EAIndexFlags flags;
            flags.fileIndex = file_index;
            flags.index = index;
            std::vector<std::string> expected;
            if (Reports() && index == 1) expected.push_back(IndexCall(new_, old_));
            if (Reports() && file_index == 1) expected.push_back(FileIndexCall(new_, old_));
            EXPECT_EQ(
                0, MAVOEARename(old_.object().c_str(), new_.object().c_str(), argument(), &flags));
            EXPECT_THAT(TakeReports(), ElementsAreArray(expected));
        }
    }
}

TEST_P(EaRenameByTypeTest, WhatTheIndexesAnswerIsIgnored) {
    old_.MakeAll();
    for (const int answer : {-1, 1}) {
        Platform().index = [answer](const std::string&) { return answer; };
        EXPECT_EQ(0, Rename(old_, new_, argument()));
    }
    ExpectNothingReported();
}

// Promise: "MAVOEARename: Other types"
TEST_F(EaRenameTest, ATypeThatNobodyHasHeardOfDoesNothing) {
    old_.MakeAll();
    const std::vector<std::string> before = All();
    TakeCallNames();
    for (const int type : {-2, 14, 256, 257, INT_MAX, INT_MIN}) {
        SCOPED_TRACE(type);
        EXPECT_EQ(0, Rename(old_, new_, type));
    }
    EXPECT_EQ(before, All());
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

// Promise: "MAVOEARename: Negative: 0xD00"
TEST_F(EaRenameTest, NullFailsWith0xD00AndDoesNothing) {
    TakeCallNames();
    for (const int type : {-1, 0, 1, 4, 7}) {
        SCOPED_TRACE(type);
        EXPECT_EQ(-1, MAVOEARename(nullptr, new_.object().c_str(), type, nullptr));
        ExpectOnly(0xD00, kUnit);
        EXPECT_EQ(-1, MAVOEARename(old_.object().c_str(), nullptr, type, nullptr));
        ExpectOnly(0xD00, kUnit);
        EXPECT_EQ(-1, MAVOEARename(nullptr, nullptr, type, nullptr));
        ExpectOnly(0xD00, kUnit);
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

// Promise: "Remove, rename and copy: `fsType` is"
// Promise: "MAVOEARename: The type is"
TEST_F(EaRenameTest, TheTypeIsAskedOfTheNewPathAndOnlyWhenItIsNotGiven) {
    Platform().fs_type = [](const std::string&, int) { return 4; };
    EXPECT_EQ(0, Rename(old_, new_, -1));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(" + new_.object() + ", 1)"));
    EXPECT_EQ(0, Rename(old_, new_, 4));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

// Promise: "MAVOEARename: The type is"
TEST_F(EaRenameTest, ARelativeNewPathWhoseTypeIsToBeFoundIsLoggedAndNothingMoves) {
    old_.MakeAll();
    const std::vector<std::string> before = All();
    // As the platform answers, which needs an absolute path.
    Platform().fs_type = [](const std::string& path, int) { return path[0] == '/' ? 1 : -1; };
    TakeCallNames();
    EXPECT_EQ(-1, MAVOEARename(old_.object().c_str(), "b", -1, nullptr));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_THAT(
        TakeLog(),
        ElementsAre("ea_rename.c:LINE Fail to detect FileSystem type. Need ABSOLUTE PATH."));
    EXPECT_EQ(before, All());
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(b, 1)"));
}

TEST_F(EaRenameTest, RelativePathsOfAGivenTypeAreRenamed) {
    old_.MakeAll();
    const auto former = std::filesystem::current_path();
    std::filesystem::current_path(old_.parent);
    EXPECT_EQ(0, MAVOEARename("a", "b", 1, nullptr));
    EXPECT_EQ(0, MAVOEARename("a", "b", 0, nullptr));
    std::filesystem::current_path(former);
    ExpectFilesOf(old_, beside_);
    ExpectFolderOf(old_, beside_);
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(beside_.sidecar()));
    ExpectNothingReported();
}

// ---- In the EA directory ------------------------------------------------------------------------

TEST_F(EaRenameTest, ResourceFileStreamAndFolderMoveInThisOrderThenTheIndexesThenTheArchiveBit) {
    old_.MakeAll();
    new_.MakeObject();
    TakeCalls();
    std::vector<std::string> renames;
    Platform().index = [&](const std::string&) {
        const auto calls = TakeRenames();
        renames.insert(renames.end(), calls.begin(), calls.end());
        EXPECT_THAT(archived_, IsEmpty());
        EXPECT_FALSE(Exists(old_.ea_dir()));
        return 0;
    };
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(renames, ElementsAre(RenameCall(old_.resource(), new_.resource()),
                                     RenameCall(old_.stream(), new_.stream()),
                                     RenameCall(old_.folder(), new_.folder())));
    EXPECT_THAT(TakeRenames(), IsEmpty());
    ExpectBothIndexesTold(old_, new_);
    EXPECT_THAT(archived_, ElementsAre(new_.object()));
}

TEST_F(EaRenameTest, AnArchiveBitThatCannotBeSetIsNoFailure) {
    new_.MakeObject();
    const FailCall fault("archive", EPERM);
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_TRUE(fault.fired());
    ExpectNothingReported();
}

TEST_F(EaRenameTest, OneKindAloneMovesAlone) {
    old_.MakeStream();
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(), ElementsAre("from/", "to/", "to/@eaDir/", "to/@eaDir/b@MavoEAStream"));
    old_.MakeResource();
    EXPECT_EQ(0, Rename(old_, new_));
    // What the other object of that name had of the other kind stays.
    EXPECT_THAT(All(), ElementsAre("from/", "to/", "to/@eaDir/", "to/@eaDir/b@MavoEAStream",
                                   "to/@eaDir/b@MavoResource"));
    EXPECT_EQ(Ascii("stream of a"), ReadFile(new_.stream()));
    EXPECT_EQ(Ascii("resource of a"), ReadFile(new_.resource()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, AnEaDirectoryIsMadeForEveryoneAndTheOldOneGoesWhenItIsEmpty) {
    const Umask umask(077);
    old_.MakeStream();
    TakeCalls();
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(TakePlatformCalls(), Contains("MAVOACLSetEADirACL(" + new_.ea_dir() + ")"));
    EXPECT_THAT(TakeCalls(), Contains("mkdir(" + new_.ea_dir() + ", 0777)"));
    EXPECT_EQ(0777, ModeOf(new_.ea_dir()));
    EXPECT_FALSE(Exists(old_.ea_dir()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, AnEaDirectoryIsMadeForALegacyFolderToo) {
    old_.MakeLegacy("a:b");  // not to be converted
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(),
                ElementsAre("from/", "to/", "to/@eaDir/", "to/@eaDir/b/", "to/@eaDir/b/a:b"));
    EXPECT_EQ(0777, ModeOf(new_.ea_dir()));
    EXPECT_THAT(TakePlatformCalls(), Contains("MAVOACLSetEADirACL(" + new_.ea_dir() + ")"));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, AnEaDirectoryThatExistsKeepsItsMode) {
    MakeDir(new_.ea_dir(), 0700);
    old_.MakeStream();
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_EQ(0700, ModeOf(new_.ea_dir()));
    EXPECT_THAT(TakePlatformCalls(), Each(Not(StartsWith("MAVOACLSetEADirACL("))));
}

TEST_F(EaRenameTest, TheOldEaDirectoryStaysWithWhatIsLeftInIt) {
    old_.MakeAll();
    other_.MakeStream();
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(NamesIn(old_.ea_dir()), ElementsAre("other@MavoEAStream"));
    ExpectFilesOf(old_, new_);
}

TEST_F(EaRenameTest, ACoverDoesNotKeepTheOldEaDirectory) {
    old_.MakeStream();
    WriteFile(old_.ea_dir() + "/.cover", {});
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_FALSE(Exists(old_.ea_dir()));
    EXPECT_THAT(NamesIn(new_.ea_dir()), ElementsAre("b@MavoEAStream"));
}

TEST_F(EaRenameTest, AnOldEaDirectoryThatCannotBeRemovedIsNoFailure) {
    old_.MakeStream();
    WriteFile(old_.ea_dir() + "/.cover", {});
    const FailCall fault("remove", EBUSY, 0);
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_TRUE(Exists(old_.ea_dir()));
    EXPECT_TRUE(Exists(new_.stream()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, ADirectorysOwnMetadataMovesAndThatOfItsChildrenStaysInIt) {
    const ObjectFiles child{new_.object(), "child"};
    MakeDir(new_.object());
    child.MakeAll();
    old_.MakeAll();
    EXPECT_EQ(
        0, MAVOEARename((old_.object() + "/").c_str(), (new_.object() + "/").c_str(), 1, nullptr));
    ExpectFilesOf(old_, new_);
    ExpectFolderOf(old_, new_);
    EXPECT_TRUE(Exists(child.stream()));
    EXPECT_THAT(archived_, ElementsAre(new_.object()));
}

TEST_F(EaRenameTest, OtherFilesOfTheObjectInItsEaDirectoryAreNotMoved) {
    old_.MakeStream();
    WriteFile(old_.ea_dir() + "/a@Thumbnail", {});
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(NamesIn(old_.ea_dir()), ElementsAre("a@Thumbnail"));
    EXPECT_THAT(NamesIn(new_.ea_dir()), ElementsAre("b@MavoEAStream"));
}

// ---- Onto existing metadata ---------------------------------------------------------------------

// Promise: "MAVOEARename: Moves"
TEST_F(EaRenameTest, FilesThatStandAtTheNewPathAreReplaced) {
    for (const ObjectFiles& to : {beside_, new_}) {
        SCOPED_TRACE(to.object());
        old_.MakeStream();
        old_.MakeResource();
        to.MakeStream();
        to.MakeResource();
        EXPECT_EQ(0, Rename(old_, to));
        ExpectFilesOf(old_, to);
        ExpectNothingReported();
    }
}

TEST_F(EaRenameTest, ALegacyFolderThatStandsAtTheNewPathIsReplacedWithAllItsFiles) {
    for (const ObjectFiles& to : {beside_, new_}) {
        SCOPED_TRACE(to.object());
        old_.MakeAll();
        to.MakeAll();
        to.MakeLegacy("left over");
        EXPECT_EQ(0, Rename(old_, to));
        ExpectFilesOf(old_, to);
        ExpectFolderOf(old_, to);
        ExpectNothingReported();
    }
}

TEST_F(EaRenameTest, ALegacyFolderAtTheNewPathStaysWhenTheOldOneHasNone) {
    old_.MakeStream();
    new_.MakeLegacy("color");
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(NamesIn(new_.ea_dir()), ElementsAre("b", "b@MavoEAStream"));
    EXPECT_EQ(Ascii("color of b"), ReadFile(new_.folder() + "/color"));
}

// Promise: "MAVOEARename: Each move that fails"
TEST_F(EaRenameTest, ALegacyFolderAtTheNewPathThatCannotBeRemovedFailsAndTheOldOneStays) {
    old_.MakeAll();
    new_.MakeFolder();
    MakeDir(new_.folder() + "/sub");
    EXPECT_EQ(-1, Rename(old_, new_));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_THAT(TakeLog(), ElementsAre("ea_remove:LINE Fail to remove " + new_.folder() + "/sub. " +
                                       strerror(EISDIR)));
    EXPECT_TRUE(Exists(old_.folder() + "/color"));
    EXPECT_TRUE(Exists(new_.folder() + "/sub"));
    ExpectFilesOf(old_, new_);
    ExpectBothIndexesTold(old_, new_);
}

TEST_F(EaRenameTest, AFileAtTheNewPathOfTheLegacyFolderFailsTheMove) {
    old_.MakeAll();
    MakeDir(new_.ea_dir());
    WriteFile(new_.folder(), Ascii("in the way"));
    EXPECT_EQ(-1, Rename(old_, new_));
    // It cannot be opened as a folder, so it stays, and no folder can be moved over it.
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_remove"), RecordOf(0x2800, kUnit)));
    EXPECT_EQ(Ascii("in the way"), ReadFile(new_.folder()));
    EXPECT_TRUE(Exists(old_.folder() + "/color"));
    ExpectFilesOf(old_, new_);
}

// Removing the folder at the new path, its EA directory's last entry, takes the EA directory along;
// the old folder then has nowhere to go, which is not a failure.
TEST_F(EaRenameTest, ALegacyFolderStaysWhenTheNewEaDirectoryGoesWithTheFolderThatStoodThere) {
    old_.MakeLegacy("a:b");
    new_.MakeLegacy("c:d");
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(),
                ElementsAre("from/", "from/@eaDir/", "from/@eaDir/a/", "from/@eaDir/a/a:b", "to/"));
    ExpectNothingReported();
    ExpectBothIndexesTold(old_, new_);
}

TEST_F(EaRenameTest, ADirectoryAtTheNewPathOfAFileFailsTheMove) {
    old_.MakeStream();
    MakeDir(new_.ea_dir());
    MakeDir(new_.stream());
    EXPECT_EQ(-1, Rename(old_, new_));
    ExpectOnly(0x2800, kUnit);
    EXPECT_EQ(Ascii("stream of a"), ReadFile(old_.stream()));
}

TEST_F(EaRenameTest, TheSamePathOnBothSidesLosesNothing) {
    old_.MakeAll();
    const std::vector<std::string> before = All();
    EXPECT_EQ(0, Rename(old_, old_));
    EXPECT_EQ(0, Rename(old_, old_, 0));
    EXPECT_EQ(before, All());
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(old_.sidecar()));
    EXPECT_EQ(Ascii("stream of a"), ReadFile(old_.stream()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, TheSameDirectoryByAnotherWayLosesNothing) {
    ASSERT_EQ(0, ::symlink(old_.parent.c_str(), (dir_ / "link").c_str()));
    const ObjectFiles linked{dir_ / "link", "a"};
    old_.MakeAll();
    const std::vector<std::string> before = All();
    EXPECT_EQ(0, Rename(old_, linked));
    EXPECT_EQ(0, Rename(linked, old_, 0));
    EXPECT_EQ(before, All());
    EXPECT_EQ(Ascii("color of a"), ReadFile(old_.folder() + "/color"));
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(old_.sidecar()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, HardLinksOfOneFileBothStay) {
    old_.MakeStream();
    old_.MakeSidecar();
    MakeDir(new_.ea_dir());
    ASSERT_EQ(0, ::link(old_.stream().c_str(), new_.stream().c_str()));
    ASSERT_EQ(0, ::link(old_.sidecar().c_str(), new_.sidecar().c_str()));
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_EQ(0, Rename(old_, new_, 0));
    for (const std::string& path : {old_.stream(), new_.stream(), old_.sidecar(), new_.sidecar()}) {
        EXPECT_TRUE(Exists(path)) << path;
    }
    ExpectNothingReported();
}

// The device counts as well as the inode.
TEST_F(EaRenameTest, FoldersThatShareOnlyHalfOfTheirIdentityAreDifferent) {
    for (const bool same_device : {false, true}) {
        SCOPED_TRACE(same_device);
        old_.MakeAll();
        beside_.MakeLegacy("left over");
        beside_.MakeSidecar();
        Hooks().stat = [&](const char* path, struct stat* info) {
            const int result = ::stat(path, info);
            const bool old_one = old_.folder() == path || old_.sidecar() == path;
            if (same_device) {
                info->st_dev = 7;
                info->st_ino = old_one ? 1 : 2;
            } else {
                info->st_dev = old_one ? 1 : 2;
                info->st_ino = 7;
            }
            return result;
        };
        EXPECT_EQ(0, Rename(old_, beside_));
        ExpectFolderOf(old_, beside_);
        TakeCalls();
        EXPECT_EQ(0, Rename(old_, beside_, 0));
        EXPECT_THAT(TakeCalls(), Contains("remove(" + beside_.sidecar() + ")"));
        EXPECT_EQ(Ascii("sidecar of a"), ReadFile(beside_.sidecar()));
        Hooks().stat = nullptr;
        std::filesystem::remove_all(beside_.ea_dir());
    }
    ExpectNothingReported();
}

// ---- Moves that fail ----------------------------------------------------------------------------

// Promise: "MAVOEARename: 0x2800"
TEST_F(EaRenameTest, EachMoveThatFailsCountsOneAndTheOthersAreMade) {
    new_.MakeObject();
    for (int nth = 1; nth <= 3; ++nth) {
        for (const int error : {EACCES, EIO, ENOSPC, EISDIR}) {
            SCOPED_TRACE(std::to_string(nth) + " " + strerror(error));
            old_.MakeAll();
            const FailCall fault("rename", error, nth);
            EXPECT_EQ(-1, Rename(old_, new_));
            ExpectOnly(0x2800, kUnit);
            EXPECT_EQ(nth == 1, Exists(old_.resource()));
            EXPECT_EQ(nth == 2, Exists(old_.stream()));
            EXPECT_EQ(nth == 3, Exists(old_.folder()));
            EXPECT_EQ(nth != 1, Exists(new_.resource()));
            EXPECT_EQ(nth != 2, Exists(new_.stream()));
            EXPECT_EQ(nth != 3, Exists(new_.folder()));
            ExpectBothIndexesTold(old_, new_);
            EXPECT_THAT(archived_, ElementsAre(new_.object()));
            archived_.clear();
            std::filesystem::remove_all(old_.ea_dir());
            std::filesystem::remove_all(new_.ea_dir());
        }
    }
}

// Promise: "MAVOEARename: Types 1, 2,"
// Promise: "MAVOEARename: the archive bit"
// Promise: "MAVOEARename: Each move that fails"
TEST_F(EaRenameTest, AllMovesFailingCountThree) {
    old_.MakeAll();
    new_.MakeObject();
    const std::vector<std::string> before = All();
    {
        const FailCall fault("rename", EACCES, 0);
        EXPECT_EQ(-3, Rename(old_, new_));
    }
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2800, kUnit), RecordOf(0x2800, kUnit),
                                           RecordOf(0x2800, kUnit)));
    ExpectBothIndexesTold(old_, new_);
    EXPECT_THAT(archived_, ElementsAre(new_.object()));
    ASSERT_EQ(0, ::rmdir(new_.ea_dir().c_str()));
    EXPECT_EQ(before, All());
}

TEST_F(EaRenameTest, TwoMovesFailingCountTwo) {
    old_.MakeStream();
    old_.MakeResource();
    const FailCall fault("rename", EACCES, 0);
    EXPECT_EQ(-2, Rename(old_, new_));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2800, kUnit), RecordOf(0x2800, kUnit)));
}

TEST_F(EaRenameTest, AFileThatIsGoneWhenItIsMovedIsNoFailure) {
    old_.MakeStream();
    const FailCall fault("rename", ENOENT);
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_TRUE(fault.fired());
    ExpectNothingReported();
}

TEST_F(EaRenameTest, TheOldEaDirectoryGoesAfterAFileThatWasGoneWhenItWasMoved) {
    old_.MakeStream();
    Hooks().before = [&](const std::string& name) {
        if (name == "rename") ::unlink(old_.stream().c_str());
    };
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_FALSE(Exists(old_.ea_dir()));
    ExpectNothingReported();
}

// Promise: "MAVOEARename: the codes of paths"
TEST_F(EaRenameTest, AnEaDirectoryThatCannotBeMadeFailsEveryMove) {
    old_.MakeAll();
    const std::vector<std::string> before = All();
    {
        const FailCall fault("mkdir", ENOSPC, 0);
        EXPECT_EQ(-3, Rename(old_, new_));
    }
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0x3C00, "ea_mkdir.c"), RecordOf(0x3C00, "ea_mkdir.c"),
                            RecordOf(0x3C00, "ea_mkdir.c")));
    EXPECT_EQ(before, All());
    ExpectBothIndexesTold(old_, new_);
}

TEST_F(EaRenameTest, AnEaDirectoryThatCannotBeMadeAtOnceIsTriedForEveryMove) {
    old_.MakeAll();
    const FailCall fault("mkdir", EIO, 1);
    EXPECT_EQ(-1, Rename(old_, new_));
    ExpectOnly(0x3C00, "ea_mkdir.c");
    EXPECT_TRUE(Exists(old_.resource()));
    EXPECT_TRUE(Exists(new_.stream()));
    ExpectFolderOf(old_, new_);
}

TEST_F(EaRenameTest, ANewParentThatIsMissingFailsEveryMove) {
    old_.MakeAll();
    const ObjectFiles nowhere{dir_ / "none", "b"};
    EXPECT_EQ(-3, Rename(old_, nowhere));
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0x3C00, "ea_mkdir.c"), RecordOf(0x3C00, "ea_mkdir.c"),
                            RecordOf(0x3C00, "ea_mkdir.c")));
    EXPECT_TRUE(Exists(old_.stream()));
    EXPECT_TRUE(Exists(old_.resource()));
    EXPECT_TRUE(Exists(old_.folder()));
    ExpectBothIndexesTold(old_, nowhere);
}

TEST_F(EaRenameTest, WhatCannotBeLookedAtIsNotThere) {
    old_.MakeAll();
    const std::vector<std::string> before = All();
    Hooks().stat = [](const char*, struct stat*) {
        errno = EACCES;
        return -1;
    };
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_EQ(before, All());
    ExpectNothingReported();
}

// Promise: "MAVOEARename: the codes of paths"
TEST_F(EaRenameTest, PathsThatAreTooLongFailEveryMove) {
    const std::string endless = dir_.path() + "/" + std::string(5000, 'n');
    EXPECT_EQ(-3, MAVOEARename(endless.c_str(), new_.object().c_str(), 1, nullptr));
    EXPECT_THAT(TakeRecords(), AllOf(Contains(RecordOf(0xC300, "ea_path")).Times(2),
                                     Contains(RecordOf(0xC300, "ea_dir_path"))));
    old_.MakeAll();
    EXPECT_EQ(-3, MAVOEARename(old_.object().c_str(), endless.c_str(), 1, nullptr));
    EXPECT_THAT(TakeRecords(), AllOf(Contains(RecordOf(0xC300, "ea_path")).Times(2),
                                     Contains(RecordOf(0xC300, "ea_dir_path"))));
    EXPECT_TRUE(Exists(old_.stream()));
    EXPECT_TRUE(Exists(old_.resource()));
    EXPECT_TRUE(Exists(old_.folder()));
    EXPECT_EQ(2u, TakeReports().size() / 2);
}

TEST_F(EaRenameTest, OnlyTheFolderAsksForTheNewPathWhereThereIsNothingToMove) {
    const std::string endless = dir_.path() + "/" + std::string(5000, 'n');
    EXPECT_EQ(-1, MAVOEARename(old_.object().c_str(), endless.c_str(), 1, nullptr));
    ExpectOnly(0xC300, "ea_dir_path");
}

TEST_F(EaRenameTest, EmptyPathsFailEveryMove) {
    old_.MakeAll();
    EXPECT_EQ(-3, MAVOEARename(old_.object().c_str(), "", 1, nullptr));
    EXPECT_EQ(-3, MAVOEARename("", new_.object().c_str(), 1, nullptr));
    EXPECT_THAT(TakeRecords(), Not(IsEmpty()));
    EXPECT_TRUE(Exists(old_.stream()));
    EXPECT_TRUE(Exists(old_.folder()));
}

TEST_F(EaRenameTest, EveryFailingCallStillTellsTheIndexesAndLosesNothing) {
    for (const int type : {0, 1}) {
        for (int nth = 1;; ++nth) {
            SCOPED_TRACE("type " + std::to_string(type) + ", call " + std::to_string(nth));
            ASSERT_LT(nth, 200);
            const TempDir dir;
            const ObjectFiles from{dir / "from", "a"};
            const ObjectFiles to{dir / "to", "b"};
            MakeDir(from.parent);
            MakeDir(to.parent);
            from.MakeSidecar();
            from.MakeStream();
            from.MakeResource();
            from.MakeLegacy("a:b");  // not to be converted, whatever is taken for missing
            to.MakeObject();
            TakePlatformCalls();
            const FailNthCall fault(nth, EIO);
            const int result = Rename(from, to, type);
            ExpectBothIndexesTold(from, to);
            EXPECT_EQ(descriptors_, OpenDescriptors());
            EXPECT_EQ(live_blocks_, TakeAllocations().live);
            // Each item stands at one of the two places, whole.
            EXPECT_NE(Exists(from.stream()), Exists(to.stream()));
            EXPECT_NE(Exists(from.resource()), Exists(to.resource()));
            EXPECT_NE(Exists(from.sidecar()), Exists(to.sidecar()));
            EXPECT_NE(Exists(from.folder() + "/a:b"), Exists(to.folder() + "/a:b"));
            const std::size_t codes = TakeRecords().size();
            EXPECT_THAT(TakeLog(), IsEmpty());
            if (!fault.fired()) {
                EXPECT_EQ(0, result);
                EXPECT_EQ(0u, codes);
                break;
            }
            EXPECT_GE(0, result);
            EXPECT_LE(-1, result);
            if (type == 0) {
                EXPECT_EQ(0, result);
            }
            if (result != 0) {
                EXPECT_EQ(1u, codes) << fault.name();
            }
            if (type == 1 && (fault.name() == "rename" || fault.name() == "mkdir")) {
                EXPECT_EQ(-1, result);
            }
        }
    }
}

// ---- Across volumes -----------------------------------------------------------------------------

// What the kernel says where the new path is on another volume.
class EaRenameAcrossTest : public EaRenameTest {
 protected:
    // The exit statuses of the runs to come, which move nothing.
    void Answer(std::vector<int> statuses) {
        std::reverse(statuses.begin(), statuses.end());
        Platform().exec = [statuses](const std::vector<std::string>&) mutable {
            if (statuses.empty()) return 0;
            const int status = statuses.back();
            statuses.pop_back();
            return status;
        };
    }
    void ExpectAllThreeRun() const {
        EXPECT_THAT(TakeExecs(), ElementsAre(MvCall(old_.resource(), new_.resource()),
                                             MvCall(old_.stream(), new_.stream()),
                                             MvCall(old_.folder(), new_.folder())));
    }
};

TEST_F(EaRenameAcrossTest, MvMovesEachOfTheThree) {
    old_.MakeAll();
    new_.MakeObject();
    {
        const FailCall fault("rename", EXDEV, 0);
        EXPECT_EQ(0, Rename(old_, new_));
    }
    ExpectAllThreeRun();
    ExpectFilesOf(old_, new_);
    ExpectFolderOf(old_, new_);
    EXPECT_FALSE(Exists(old_.ea_dir()));
    EXPECT_THAT(archived_, ElementsAre(new_.object()));
    ExpectNothingReported();
}

// Promise: "MAVOEARename: Types 1, 2,"
TEST_F(EaRenameAcrossTest, MvRunsOnlyForWhatIsOnAnotherVolume) {
    old_.MakeAll();
    const FailCall fault("rename", EXDEV, 2);
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(TakeExecs(), ElementsAre(MvCall(old_.stream(), new_.stream())));
    ExpectFilesOf(old_, new_);
    ExpectFolderOf(old_, new_);
}

// Promise: "MAVOEARename: Each move that fails"
TEST_F(EaRenameAcrossTest, MvsExitStatusIsTheResultAndIsRecordedOnTwoLines) {
    for (const int status : {1, 2, 127, 255, -1}) {
        SCOPED_TRACE(status);
        old_.MakeStream();
        Answer({status});
        const FailCall fault("rename", EXDEV, 0);
        EXPECT_EQ(status, Rename(old_, new_));
        EXPECT_THAT(TakeExecs(), ElementsAre(MvCall(old_.stream(), new_.stream())));
        const std::vector<Record> records = TakeRecords();
        ASSERT_THAT(records, ElementsAre(RecordOf(0x2800, kUnit), RecordOf(0x2800, kUnit)));
        EXPECT_NE(records[0].line, records[1].line);
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_TRUE(Exists(old_.stream()));
    }
}

// Promise: "MAVOEARename: Types 1, 2,"
TEST_F(EaRenameAcrossTest, TheResultIsTheSumOfTheStatusesAsItStands) {
    const std::vector<std::pair<std::vector<int>, int>> kSums = {
        {{1, 2, 4}, 7},     {{0, 0, 3}, 3},   {{5, 0, 0}, 5},
        {{0, 6, 0}, 6},     {{1, -1, 0}, 0},  // sic
        {{-1, -1, -1}, -3}, {{-1, 3, -1}, 1},
    };
    for (const auto& [statuses, sum] : kSums) {
        SCOPED_TRACE(::testing::PrintToString(statuses));
        old_.MakeAll();
        new_.MakeObject();
        Answer(statuses);
        const FailCall fault("rename", EXDEV, 0);
        EXPECT_EQ(sum, Rename(old_, new_));
        const auto failures = static_cast<std::size_t>(std::count_if(
            statuses.begin(), statuses.end(), [](int status) { return status != 0; }));
        EXPECT_EQ(2 * failures, TakeRecords().size());
        const std::vector<std::string> calls = TakePlatformCalls();
        EXPECT_THAT(calls, IsSupersetOf({MvCall(old_.resource(), new_.resource()),
                                         MvCall(old_.stream(), new_.stream()),
                                         MvCall(old_.folder(), new_.folder()),
                                         IndexCall(new_, old_), FileIndexCall(new_, old_)}));
        EXPECT_THAT(archived_, ElementsAre(new_.object()));
        archived_.clear();
    }
}

TEST_F(EaRenameAcrossTest, TheOldEaDirectoryIsLookedAtOnlyAfterASuccess) {
    old_.MakeStream();
    Platform().exec = [&](const std::vector<std::string>&) {
        ::unlink(old_.stream().c_str());
        return 1;
    };
    {
        const FailCall fault("rename", EXDEV, 0);
        EXPECT_EQ(1, Rename(old_, new_));
    }
    EXPECT_TRUE(Exists(old_.ea_dir()));

    old_.MakeStream();
    Platform().exec = [&](const std::vector<std::string>&) {
        ::unlink(old_.stream().c_str());
        return 0;
    };
    const FailCall fault("rename", EXDEV, 0);
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_FALSE(Exists(old_.ea_dir()));
}

TEST_F(EaRenameAcrossTest, ASidecarIsNotCarriedToAnotherVolume) {
    old_.MakeAll();
    const FailCall fault("rename", EXDEV, 0);
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_THAT(TakeExecs(), IsEmpty());
    EXPECT_TRUE(Exists(old_.sidecar()));
    EXPECT_TRUE(Exists(old_.folder()));
    EXPECT_FALSE(Exists(new_.sidecar()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, ARealSecondVolumeGetsEverythingByMv) {
    const SecondVolume volume;
    if (!volume.ok()) GTEST_SKIP() << "no second filesystem: needs a mount or /dev/shm";
    const ObjectFiles there{volume.path(), "b"};
    descriptors_ = OpenDescriptors();
    there.MakeObject();
    old_.MakeAll();
    EXPECT_EQ(0, Rename(old_, there));
    EXPECT_THAT(
        TakePlatformCalls(),
        ElementsAre("MAVOGetFSType(" + there.ea_dir() + ", 0)",
                    "MAVOACLSetEADirACL(" + there.ea_dir() + ")",
                    MvCall(old_.resource(), there.resource()),
                    MvCall(old_.stream(), there.stream()), MvCall(old_.folder(), there.folder()),
                    IndexCall(there, old_), FileIndexCall(there, old_)));
    ExpectFilesOf(old_, there);
    ExpectFolderOf(old_, there);
    EXPECT_EQ(0777, ModeOf(there.ea_dir()));
    EXPECT_THAT(All(), ElementsAre("from/", "from/._a", "to/"));
    EXPECT_FALSE(Exists(old_.ea_dir()));
    EXPECT_THAT(archived_, ElementsAre(there.object()));
    ExpectNothingReported();

    // And back.
    EXPECT_EQ(0, Rename(there, old_));
    EXPECT_FALSE(Exists(there.ea_dir()));
    EXPECT_EQ(Ascii("stream of a"), ReadFile(old_.stream()));
    EXPECT_EQ(Ascii("color of a"), ReadFile(old_.folder() + "/color"));
}

TEST_F(EaRenameTest, OntoMetadataOnARealSecondVolumeItIsReplaced) {
    const SecondVolume volume;
    if (!volume.ok()) GTEST_SKIP() << "no second filesystem: needs a mount or /dev/shm";
    const ObjectFiles there{volume.path(), "b"};
    descriptors_ = OpenDescriptors();
    old_.MakeAll();
    there.MakeAll();
    there.MakeLegacy("left over");
    EXPECT_EQ(0, Rename(old_, there));
    ExpectFilesOf(old_, there);
    ExpectFolderOf(old_, there);
    EXPECT_EQ(Ascii("sidecar of b"), ReadFile(there.sidecar()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, NamesOfEveryKindReachARealSecondVolume) {
    const SecondVolume volume;
    if (!volume.ok()) GTEST_SKIP() << "no second filesystem: needs a mount or /dev/shm";
    for (const std::string& name : OddNames()) {
        SCOPED_TRACE(name);
        const ObjectFiles from{old_.parent, name};
        const ObjectFiles there{volume.path(), name + "2"};
        from.MakeAll();
        EXPECT_EQ(0, Rename(from, there));
        ExpectFilesOf(from, there);
        ExpectFolderOf(from, there);
    }
    EXPECT_FALSE(Exists(old_.ea_dir()));
    ExpectNothingReported();
    descriptors_ = OpenDescriptors();
}

TEST_F(EaRenameTest, ASecondVolumeWithoutRoomFailsWithMvsStatusAndKeepsTheOldFiles) {
    // Room for its root and "@eaDir".
    const SecondVolume volume("nr_inodes=2", true);
    if (!volume.ok()) GTEST_SKIP() << "needs to mount";
    const ObjectFiles there{volume.path(), "b"};
    descriptors_ = OpenDescriptors();
    old_.MakeAll();
    EXPECT_EQ(3, Rename(old_, there));
    EXPECT_EQ(6u, TakeRecords().size());
    EXPECT_THAT(NamesIn(there.ea_dir()), IsEmpty());
    EXPECT_EQ(Ascii("stream of a"), ReadFile(old_.stream()));
    EXPECT_EQ(Ascii("resource of a"), ReadFile(old_.resource()));
    EXPECT_EQ(Ascii("color of a"), ReadFile(old_.folder() + "/color"));
    ExpectBothIndexesTold(old_, there);
}

// ---- Legacy layouts -----------------------------------------------------------------------------

// The attributes in the stream at `path`.
std::map<std::string, Bytes> AttributesIn(const std::string& path) {
    std::map<std::string, Bytes> attributes;
    const int fd = ::open(path.c_str(), O_RDONLY);
    EASHandle* const handle = MAVOEASOpen(fd, F_RDLCK);
    if (handle != nullptr) {
        MLIBCSzList* list = NewList();
        MAVOEASEnum(handle, &list);
        for (const std::string& name : Strings(list)) {
            Bytes value(100);
            const int size = MAVOEASRead(handle, name.c_str(), value.data(), 100, 0);
            value.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
            attributes[name] = value;
        }
        MLIBCSzListFree(list);
        MAVOEASClose(handle);
    }
    ::close(fd);
    return attributes;
}

// Promise: "MAVOEARename: legacy layouts"
TEST_F(EaRenameTest, AttributeFilesBecomeTheStreamAtTheNewPath) {
    old_.MakeLegacy("color");
    old_.MakeLegacy("tags");
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(), ElementsAre("from/", "to/", "to/@eaDir/", "to/@eaDir/b@MavoEAStream"));
    const std::map<std::string, Bytes> expected = {{"color", Ascii("color of a")},
                                                   {"tags", Ascii("tags of a")}};
    EXPECT_EQ(expected, AttributesIn(new_.stream()));
    ExpectNothingReported();
}

// Promise: "MAVOEARename: legacy layouts"
TEST_F(EaRenameTest, ALegacyResourceFileBecomesTheResourceFileAtTheNewPath) {
    MakeDir(old_.ea_dir());
    MakeDir(old_.folder());
    const Bytes resource = PlainAppleDouble(Pattern(32), Pattern(40, 3));
    WriteFile(old_.folder() + "/MAVO:Resource", resource);
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(), ElementsAre("from/", "to/", "to/@eaDir/", "to/@eaDir/b@MavoResource"));
    EXPECT_EQ(resource, ReadFile(new_.resource()));
}

TEST_F(EaRenameTest, WhatTheUpgradeLeavesInTheLegacyFolderMovesWithIt) {
    old_.MakeLegacy("color");
    old_.MakeLegacy("MAVO:Other");
    old_.MakeLegacy("a:b");
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(),
                ElementsAre("from/", "to/", "to/@eaDir/", "to/@eaDir/b/", "to/@eaDir/b/MAVO:Other",
                            "to/@eaDir/b/a:b", "to/@eaDir/b@MavoEAStream"));
    EXPECT_EQ(Ascii("color of a"), AttributesIn(new_.stream())["color"]);
}

TEST_F(EaRenameTest, ASidecarBecomesTheStreamWhileTheOldObjectStands) {
    const Bytes sidecar = PlainAppleDouble(Pattern(32), Pattern(40, 3));
    WriteFile(old_.sidecar(), sidecar);
    // A sidecar without its object is nobody's.
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(), ElementsAre("from/", "from/._a", "to/"));
    old_.MakeObject();
    EXPECT_EQ(0, Rename(old_, new_));
    EXPECT_THAT(All(),
                ElementsAre("from/", "from/a", "to/", "to/@eaDir/", "to/@eaDir/b@MavoEAStream"));
    EXPECT_EQ(sidecar, ReadFile(new_.stream()));
    ExpectNothingReported();
}

// Promise: "MAVOEARename: the codes of paths"
TEST_F(EaRenameTest, AnUpgradeThatFailsFailsItsMoveAndNoOther) {
    MakeDir(old_.ea_dir());
    old_.MakeStream();
    old_.MakeLegacy("MAVO:Resource");
    const FailCall fault("rename", EIO, 1);  // into the current layout
    EXPECT_EQ(-1, Rename(old_, new_));
    ExpectOnly(0x2800, "ea_upgrade");
    EXPECT_EQ(Ascii("stream of a"), ReadFile(new_.stream()));
    // The folder goes as it is.
    EXPECT_EQ(Ascii("MAVO:Resource of a"), ReadFile(new_.folder() + "/MAVO:Resource"));
    EXPECT_FALSE(Exists(old_.ea_dir()));
    ExpectBothIndexesTold(old_, new_);
}

TEST_F(EaRenameTest, ALegacyFolderBesideASidecarMovesAsItIs) {
    old_.MakeSidecar();
    old_.MakeLegacy("MAVO:Resource");
    old_.MakeLegacy("color");
    EXPECT_EQ(0, Rename(old_, new_, 5));
    EXPECT_THAT(All(), ElementsAre("from/", "to/", "to/._b", "to/@eaDir/", "to/@eaDir/b/",
                                   "to/@eaDir/b/MAVO:Resource", "to/@eaDir/b/color"));
    EXPECT_EQ(0777, ModeOf(new_.ea_dir()));
    ExpectFolderOf(old_, new_);
    ExpectNothingReported();
}

// ---- Names --------------------------------------------------------------------------------------

TEST_F(EaRenameTest, MetadataOfEveryNameFollows) {
    for (const std::string& name : OddNames()) {
        SCOPED_TRACE(name);
        const ObjectFiles from{old_.parent, name};
        const ObjectFiles to{new_.parent, name + name};
        to.MakeObject();
        from.MakeAll();
        EXPECT_EQ(0, Rename(from, to));
        EXPECT_EQ(0, Rename(from, to, 0));
        ExpectFilesOf(from, to);
        ExpectFolderOf(from, to);
        EXPECT_EQ(Ascii("sidecar of " + name), ReadFile(to.sidecar()));
        EXPECT_FALSE(Exists(from.ea_dir()));
        EXPECT_THAT(TakeReports(), ElementsAre(IndexCall(to, from), FileIndexCall(to, from),
                                               IndexCall(to, from), FileIndexCall(to, from)));
        ExpectNothingReported();
    }
}

// A name, and the name that its files have.
struct LongName {
    std::string name;
    std::string shortened;
};

// The byte sum from the 242nd byte on picks the last one, from the digits 1 to 9 and 0, the letters
// and signs: for 'a', 2 * 97 = 3 * 60 + 14, 13 * 97 = 21 * 60 + 1 and 14 * 97 = 22 * 60 + 38; for
// 'b', 2 * 98 = 3 * 60 + 16, 13 * 98 = 21 * 60 + 14 and 14 * 98 = 22 * 60 + 52.
std::vector<LongName> LongNames(char letter, const std::string& last) {
    const std::string start(241, letter);
    std::vector<LongName> names = {{std::string(242, letter), std::string(242, letter)}};
    const std::size_t sizes[] = {243, 254, 255};
    for (std::size_t i = 0; i < 3; ++i) {
        names.push_back({std::string(sizes[i], letter), start + last[i]});
    }
    return names;
}

TEST_F(EaRenameTest, LongNamesFollowUnderTheirShortenedNames) {
    for (const LongName& from : LongNames('a', "e2=")) {
        for (const LongName& to : LongNames('b', "ge$")) {
            SCOPED_TRACE(std::to_string(from.name.size()) + " to " +
                         std::to_string(to.name.size()));
            const ObjectFiles source{old_.parent, from.name};
            const ObjectFiles target{new_.parent, to.name};
            source.MakeLegacy("a:b");
            const std::string start = source.ea_dir() + "/" + from.shortened;
            WriteFile(start + "@MavoEAStream", Ascii("stream"));
            WriteFile(start + "@MavoResource", Ascii("resource"));
            EXPECT_EQ(0, Rename(source, target));
            EXPECT_THAT(NamesIn(target.ea_dir()),
                        ::testing::UnorderedElementsAre(to.name, to.shortened + "@MavoEAStream",
                                                        to.shortened + "@MavoResource"));
            EXPECT_EQ(Ascii("stream"),
                      ReadFile(target.ea_dir() + "/" + to.shortened + "@MavoEAStream"));
            EXPECT_EQ(Ascii("resource"),
                      ReadFile(target.ea_dir() + "/" + to.shortened + "@MavoResource"));
            EXPECT_TRUE(Exists(target.folder() + "/a:b"));
            EXPECT_FALSE(Exists(source.ea_dir()));
            ExpectNothingReported();
            std::filesystem::remove_all(target.ea_dir());
        }
    }
}

TEST_F(EaRenameTest, AttributeFilesOfANameThatIsTooLongForASidecarAreConvertedOnTheWay) {
    const ObjectFiles from{old_.parent, std::string(254, 'a')};
    from.MakeLegacy("color");
    EXPECT_EQ(0, Rename(from, new_));
    EXPECT_THAT(All(), ElementsAre("from/", "to/", "to/@eaDir/", "to/@eaDir/b@MavoEAStream"));
    ExpectOnly(0xC300, "ea_adpath");  // of the sidecar that it cannot have
}

TEST_F(EaRenameTest, SidecarsHaveNamesOfUpTo253Bytes) {
    const ObjectFiles longest{old_.parent, std::string(253, 'a')};
    const ObjectFiles also_longest{new_.parent, std::string(253, 'b')};
    longest.MakeSidecar();
    EXPECT_EQ(0, Rename(longest, also_longest, 0));
    EXPECT_TRUE(Exists(also_longest.sidecar()));
    ExpectNothingReported();

    for (const std::size_t size : {254u, 255u}) {
        SCOPED_TRACE(size);
        const ObjectFiles too_long{new_.parent, std::string(size, 'c')};
        EXPECT_EQ(0, Rename(also_longest, too_long, 0));
        ExpectOnly(0xC300, "ea_adpath");
        EXPECT_TRUE(Exists(also_longest.sidecar()));
        TakePlatformCalls();
        EXPECT_EQ(0, Rename(too_long, also_longest, 0));
        ExpectOnly(0xC300, "ea_adpath");
        ExpectBothIndexesTold(too_long, also_longest);
    }
}

// ---- Beside the object --------------------------------------------------------------------------

TEST_F(EaRenameTest, WithoutASidecarTheLegacyFolderOfAnAppleDoubleVolumeStays) {
    old_.MakeLegacy("color");
    TakeCallNames();
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_TRUE(Exists(old_.folder() + "/color"));
    EXPECT_THAT(TakeCallNames(), ElementsAre("stat"));
    ExpectBothIndexesTold(old_, new_);
    ExpectNothingReported();
}

TEST_F(EaRenameTest, ASidecarThatStandsAtTheNewPathIsReplaced) {
    old_.MakeSidecar();
    new_.MakeSidecar();
    TakeCalls();
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_THAT(TakeCalls(), Contains("remove(" + new_.sidecar() + ")"));
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(new_.sidecar()));
    EXPECT_FALSE(Exists(old_.sidecar()));
    ExpectNothingReported();
}

TEST_F(EaRenameTest, AnEmptyDirectoryInPlaceOfTheNewSidecarIsRemovedAndAFullOneIsNot) {
    old_.MakeSidecar();
    old_.MakeLegacy("color");
    MakeDir(new_.sidecar());
    WriteFile(new_.sidecar() + "/file", {});
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(old_.sidecar()));
    EXPECT_TRUE(Exists(old_.folder() + "/color"));
    ASSERT_EQ(0, ::unlink((new_.sidecar() + "/file").c_str()));
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(new_.sidecar()));
    EXPECT_TRUE(Exists(new_.folder() + "/color"));
    ExpectNothingReported();
}

// Promise: "MAVOEARename: Types 0 and 5"
TEST_F(EaRenameTest, ASidecarAtTheNewPathThatCannotBeRemovedKeepsTheOldOneInSilence) {
    old_.MakeSidecar();
    old_.MakeLegacy("color");
    new_.MakeSidecar();
    const FailCall fault("remove", EACCES);
    TakeCallNames();
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(TakeCallNames(), Not(Contains("rename")));
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(old_.sidecar()));
    EXPECT_EQ(Ascii("sidecar of b"), ReadFile(new_.sidecar()));
    EXPECT_TRUE(Exists(old_.folder() + "/color"));
    ExpectBothIndexesTold(old_, new_);
    EXPECT_THAT(archived_, IsEmpty());
    ExpectNothingReported();
}

// Promise: "MAVOEARename: Types 0 and 5"
TEST_F(EaRenameTest, ASidecarThatCannotBeMovedStaysInSilenceAndItsFolderToo) {
    for (const int error : {EACCES, EIO, ENOENT, EXDEV}) {
        SCOPED_TRACE(strerror(error));
        old_.MakeSidecar();
        old_.MakeLegacy("color");
        new_.MakeSidecar();
        const FailCall fault("rename", error);
        EXPECT_EQ(0, Rename(old_, new_, 5));
        EXPECT_TRUE(fault.fired());
        EXPECT_EQ(Ascii("sidecar of a"), ReadFile(old_.sidecar()));
        EXPECT_FALSE(Exists(new_.sidecar()));  // that has gone before
        EXPECT_TRUE(Exists(old_.folder() + "/color"));
        ExpectBothIndexesTold(old_, new_);
        EXPECT_THAT(archived_, IsEmpty());
        ExpectNothingReported();
    }
}

// Promise: "MAVOEARename: Types 0 and 5"
TEST_F(EaRenameTest, ALegacyFolderThatCannotFollowItsSidecarIsNoFailure) {
    old_.MakeSidecar();
    old_.MakeLegacy("color");
    const FailCall fault("rename", EACCES, 2);
    EXPECT_EQ(0, Rename(old_, new_, 0));
    ExpectOnly(0x2800, kUnit);
    EXPECT_TRUE(Exists(new_.sidecar()));
    EXPECT_TRUE(Exists(old_.folder() + "/color"));
    ExpectBothIndexesTold(old_, new_);
}

TEST_F(EaRenameTest, ANewSidecarThatCannotBeLookedAtCountsAsMissing) {
    old_.MakeSidecar();
    new_.MakeSidecar();
    const FailCall fault("stat", EACCES, 2);
    EXPECT_EQ(0, Rename(old_, new_, 0));
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ(Ascii("sidecar of a"), ReadFile(new_.sidecar()));
    EXPECT_FALSE(Exists(old_.sidecar()));
}

// ---- As another user ----------------------------------------------------------------------------

TEST_F(EaRenameTest, WhoMayNotWriteTheOldEaDirectoryFailsAndLosesNothing) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    old_.MakeStream();
    MakeDir(new_.ea_dir());
    ASSERT_EQ(0, ::chmod(old_.ea_dir().c_str(), 0755));
    ASSERT_EQ(0, ::chmod(new_.ea_dir().c_str(), 0777));
    AsUser(kNobody, Root::kSaved, [this] {
        EXPECT_EQ(-1, Rename(old_, new_));
        ExpectOnly(0x2800, kUnit);
    });
    EXPECT_TRUE(Exists(old_.stream()));
    EXPECT_FALSE(Exists(new_.stream()));
}

// The upgrade asks as the real user whether there is a file, who may be another one.
TEST_F(EaRenameTest, ForWhoMayNotLookIntoTheEaDirectoryThereIsNothingToMove) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    old_.MakeStream();
    const ObjectFiles renamed = {old_.parent, "renamed"};
    for (const mode_t mode : {mode_t{0700}, mode_t{0755}}) {
        SCOPED_TRACE(mode);
        ASSERT_EQ(0, ::chmod(old_.ea_dir().c_str(), mode));
        AsUser(kNobody, Root::kSaved, [&] {
            ASSERT_EQ(0, ::setresuid(0, 0, 0));
            ASSERT_EQ(0, ::setresuid(0, kNobody, 0));
            const bool looks = mode == 0755;
            EXPECT_EQ(looks ? -1 : 0, Rename(old_, renamed));
            if (looks) {
                ExpectOnly(0x2800, kUnit);
            } else {
                ExpectNothingReported();
            }
        });
        EXPECT_TRUE(Exists(old_.stream()));
    }
}

TEST_F(EaRenameTest, OnlyWhatMayNeitherBeRenamedNorLookedAtIsNotThere) {
    old_.MakeStream();
    const ObjectFiles renamed = {old_.parent, "renamed"};
    struct {
        int rename;
        int stat;
        int result;
    } const cases[] = {{EACCES, EACCES, 0},
                       {EACCES, 0, -1},
                       {EACCES, EIO, -1},
                       {EIO, EACCES, -1},
                       {EPERM, EACCES, -1}};
    for (const auto& c : cases) {
        SCOPED_TRACE(std::to_string(c.rename) + ", " + std::to_string(c.stat));
        Hooks().fails = [&](const std::string& call) {
            if (call.starts_with("rename(" + old_.stream())) return c.rename;
            return call == "stat(" + old_.stream() + ")" ? c.stat : 0;
        };
        EXPECT_EQ(c.result, Rename(old_, renamed));
        Hooks().fails = nullptr;
        if (c.result == 0) {
            ExpectNothingReported();
        } else {
            ExpectOnly(0x2800, kUnit);
        }
        EXPECT_TRUE(Exists(old_.stream()));
    }
}

TEST_F(EaRenameTest, WithinADirectoryTheFilesAreLookedForOnce) {
    old_.MakeStream();
    old_.MakeResource();
    const ObjectFiles renamed = {old_.parent, "renamed"};
    TakeCallNames();
    EXPECT_EQ(0, Rename(old_, renamed));
    const auto names = TakeCallNames();
    EXPECT_EQ(2, std::count(names.begin(), names.end(), "access"));
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "stat"));  // the legacy folder
    EXPECT_EQ(2, std::count(names.begin(), names.end(), "rename"));
}

TEST_F(EaRenameTest, AUserMovesFilesIntoAnEaDirectoryThatTheSuperuserMakes) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    old_.MakeStream();
    for (const std::string& dir : {old_.parent, old_.ea_dir()}) {
        ASSERT_EQ(0, ::chmod(dir.c_str(), 0777));
    }
    ASSERT_EQ(0, ::chmod(new_.parent.c_str(), 0755));
    AsUser(kNobody, Root::kSaved, [this] {
        EXPECT_EQ(0, Rename(old_, new_));
        ExpectNothingReported();
        EXPECT_EQ(kNobody, ::geteuid());
    });
    EXPECT_TRUE(Exists(new_.stream()));
    struct stat info;
    ASSERT_EQ(0, ::stat(new_.ea_dir().c_str(), &info));
    EXPECT_EQ(0u, info.st_uid);
    EXPECT_FALSE(Exists(old_.ea_dir()));
}

}  // namespace
}  // namespace mavoea::test

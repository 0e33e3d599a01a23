// Removing metadata in every place and form, and the EA directories that are left empty.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <limits.h>
#include <stddef.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <tuple>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;

constexpr char kUnit[] = "ea_remove";
constexpr uid_t kNobody = 65534;

std::string IndexCall(const std::string& path) {
    return "MLIBMavoIndexAddEx(" + path + ", NULL, 7, 0, 0)";
}
std::string FileIndexCall(const std::string& path) {
    return "MLIBMavoFileIndexAdd(" + path + ", NULL, 6)";
}

class EaRemoveTest : public ::testing::Test {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        file_.MakeObject();
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

    static void ExpectOnly(int code, const std::string& unit) {
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, unit)));
        EXPECT_THAT(TakeLog(), IsEmpty());
    }
    static void ExpectOnlyLogged(const std::string& line) {
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_THAT(TakeLog(), ElementsAre(line));
    }
    void ExpectBothIndexesTold() const {
        EXPECT_THAT(TakePlatformCalls(),
                    ElementsAre(IndexCall(file_.object()), FileIndexCall(file_.object())));
    }
    void ExpectArchived() {
        EXPECT_THAT(archived_, ElementsAre(file_.object()));
        archived_.clear();
    }

    std::vector<std::string> Left() const { return Tree(dir_.path()); }

    int Remove(int type) const { return MAVOEARemove(file_.object().c_str(), type, nullptr); }
    int RemoveForm(int form) const { return EARemove(form, file_.object().c_str()); }
    int RemoveEaDir() const { return EARemoveEADir((file_.ea_dir() + "/x").c_str()); }

    TempDir dir_;
    const ObjectFiles file_{dir_.path(), "a.txt"};
    const ObjectFiles other_{dir_.path(), "other"};
    const std::string cover_ = file_.ea_dir() + "/.cover";
    std::vector<std::string> archived_;
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// ---- By type of volume --------------------------------------------------------------------------

constexpr bool IsAppleDouble(int type) { return type == 0 || type == 5; }
constexpr bool IsEaDir(int type) {
    return type == 1 || type == 2 || type == 3 || type == 6 || type == 10;
}

// Every type, given by the caller and found.
class EaRemoveByTypeTest : public EaRemoveTest,
                           public ::testing::WithParamInterface<std::tuple<int, bool>> {
 protected:
    void SetUp() override {
        EaRemoveTest::SetUp();
        Platform().fs_type = [](const std::string&, int) { return std::get<0>(GetParam()); };
    }
    static int type() { return std::get<0>(GetParam()); }
    static int argument() { return std::get<1>(GetParam()) ? -1 : type(); }
    // The platform's calls but the question for the type.
    static std::vector<std::string> TakeReports() {
        std::vector<std::string> calls = TakePlatformCalls();
        std::erase_if(calls, [](const auto& call) { return call.starts_with("MAVOGetFSType("); });
        return calls;
    }
};

INSTANTIATE_TEST_SUITE_P(Of, EaRemoveByTypeTest,
                         ::testing::Combine(::testing::Range(0, 14), ::testing::Bool()),
                         [](const auto& about) {
                             return "Type" + std::to_string(std::get<0>(about.param)) +
                                    (std::get<1>(about.param) ? "Found" : "Given");
                         });

// Promise: "MAVOEARemove: Removes"
// Promise: "MAVOEARemove: On types 0 and 5"
TEST_P(EaRemoveByTypeTest, WhatIsRemovedIsWhatTheVolumeKeeps) {
    file_.MakeAll();
    const std::vector<std::string> before = Left();
    EXPECT_EQ(0, Remove(argument()));
    if (IsAppleDouble(type())) {
        EXPECT_THAT(Left(), ElementsAre("@eaDir/", "@eaDir/a.txt@MavoEAStream",
                                        "@eaDir/a.txt@MavoResource", "a.txt"));
    } else if (IsEaDir(type())) {
        EXPECT_THAT(Left(), ElementsAre("._a.txt", "a.txt"));
    } else {
        EXPECT_EQ(before, Left());
    }
    EXPECT_EQ(Ascii("data of a.txt"), ReadFile(file_.object()));
    ExpectNothingReported();
}

TEST_P(EaRemoveByTypeTest, NothingToRemoveIsASuccess) {
    EXPECT_EQ(0, Remove(argument()));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

TEST_P(EaRemoveByTypeTest, AnObjectThatIsGoneAlreadyIsRemovedAllTheSame) {
    file_.MakeAll();
    ASSERT_EQ(0, ::unlink(file_.object().c_str()));
    EXPECT_EQ(0, Remove(argument()));
    EXPECT_EQ(IsAppleDouble(type()), !Exists(file_.sidecar()));
    EXPECT_EQ(IsEaDir(type()), !Exists(file_.ea_dir()));
    EXPECT_THAT(archived_, IsEmpty());
    ExpectNothingReported();
}

// Promise: "MAVOEARemove: On types 0 and 5"
TEST_P(EaRemoveByTypeTest, TheIndexesAreToldWhereTheTypeIsKnownAndTheArchiveBitIsOfEaDirectories) {
    file_.MakeAll();
    TakeCallNames();
    EXPECT_EQ(0, Remove(argument()));
    if (IsAppleDouble(type()) || IsEaDir(type()) || type() == 7) {
        EXPECT_THAT(TakeReports(),
                    ElementsAre(IndexCall(file_.object()), FileIndexCall(file_.object())));
    } else {
        EXPECT_THAT(TakeReports(), IsEmpty());
    }
    const std::vector<std::string> calls = TakeCallNames();
    EXPECT_EQ(IsEaDir(type()) ? 1 : 0, std::count(calls.begin(), calls.end(), "archive"));
    if (IsEaDir(type())) ExpectArchived();
}

// Promise: "EAIndexFlags: a NULL pointer means both"
// Promise: "MAVOIndex: op is"
// Promise: "fileIndex"
// Promise: "index"
// Promise: "Remove, rename and copy: the platform's indexes"
TEST_P(EaRemoveByTypeTest, EachSettingOfTheOptionsTellsTheIndexesThatItSays) {
    const bool reports = IsAppleDouble(type()) || IsEaDir(type()) || type() == 7;
    for (const int file_index : {-1, 0, 1, 2}) {
        for (const int index : {-1, 0, 1, 2}) {
            SCOPED_TRACE(std::to_string(file_index) + " " + std::to_string(index));
            EAIndexFlags flags;
            flags.fileIndex = file_index;
            flags.index = index;
            std::vector<std::string> expected;
            if (reports && index == 1) expected.push_back(IndexCall(file_.object()));
            if (reports && file_index == 1) expected.push_back(FileIndexCall(file_.object()));
            EXPECT_EQ(0, MAVOEARemove(file_.object().c_str(), argument(), &flags));
            EXPECT_THAT(TakeReports(), ElementsAreArray(expected));
            EXPECT_EQ(file_index, flags.fileIndex);
            EXPECT_EQ(index, flags.index);
        }
    }
}

TEST_P(EaRemoveByTypeTest, WhatTheIndexesAnswerIsIgnored) {
    file_.MakeAll();
    for (const int answer : {-1, 1}) {
        Platform().index = [answer](const std::string&) { return answer; };
        EXPECT_EQ(0, Remove(argument()));
    }
    ExpectNothingReported();
}

// Promise: "MAVOEARemoveWithoutEAStream"
TEST_P(EaRemoveByTypeTest, WithoutTheStreamMeansThatItStays) {
    file_.MakeAll();
    const std::vector<std::string> before = Left();
    EXPECT_EQ(0, MAVOEARemoveWithoutEAStream(file_.object().c_str(), argument()));
    if (IsAppleDouble(type())) {
        EXPECT_THAT(Left(), ElementsAre("@eaDir/", "@eaDir/a.txt@MavoEAStream",
                                        "@eaDir/a.txt@MavoResource", "a.txt"));
    } else if (IsEaDir(type())) {
        EXPECT_THAT(Left(),
                    ElementsAre("._a.txt", "@eaDir/", "@eaDir/a.txt@MavoEAStream", "a.txt"));
        EXPECT_EQ(Ascii("stream of a.txt"), ReadFile(file_.stream()));
        ExpectArchived();
    } else {
        EXPECT_EQ(before, Left());
    }
    if (IsAppleDouble(type()) || IsEaDir(type()) || type() == 7) {
        EXPECT_THAT(TakeReports(),
                    ElementsAre(IndexCall(file_.object()), FileIndexCall(file_.object())));
    } else {
        EXPECT_THAT(TakeReports(), IsEmpty());
    }
    ExpectNothingReported();
}

// Promise: "MAVOEARemove: other types"
TEST_F(EaRemoveTest, ATypeThatNobodyHasHeardOfDoesNothing) {
    file_.MakeAll();
    const std::vector<std::string> before = Left();
    TakeCallNames();
    for (const int type : {-2, 14, 256, 257, INT_MAX, INT_MIN}) {
        SCOPED_TRACE(type);
        EXPECT_EQ(0, Remove(type));
    }
    EXPECT_EQ(before, Left());
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

// Promise: "fileIndex"
TEST_F(EaRemoveTest, TheFileIndexIsTheFirstOption) {
    static_assert(offsetof(EAIndexFlags, fileIndex) == 0);
    static_assert(offsetof(EAIndexFlags, index) == sizeof(int));
    static_assert(sizeof(EAIndexFlags) == 2 * sizeof(int));
    EAIndexFlags flags = {1, 0};
    EXPECT_EQ(0, MAVOEARemove(file_.object().c_str(), 1, &flags));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(FileIndexCall(file_.object())));
}

TEST_F(EaRemoveTest, TheIndexesAreToldAfterTheRemovalAndBeforeTheArchiveBitIsSet) {
    file_.MakeAll();
    int told = 0;
    Platform().index = [&](const std::string&) {
        ++told;
        EXPECT_FALSE(Exists(file_.ea_dir()));
        EXPECT_THAT(archived_, IsEmpty());
        return 0;
    };
    EXPECT_EQ(0, Remove(1));
    EXPECT_EQ(2, told);
    ExpectArchived();
}

TEST_F(EaRemoveTest, AnArchiveBitThatCannotBeSetIsNoFailure) {
    {
        const FailCall fault("archive", EPERM);
        EXPECT_EQ(0, Remove(1));
        EXPECT_TRUE(fault.fired());
    }
    Hooks().archive = [](int) { return 5; };
    EXPECT_EQ(0, Remove(1));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, ADirectorysOwnMetadataGoesAndThatOfItsChildrenStays) {
    const ObjectFiles directory{dir_.path(), "folder"};
    const ObjectFiles child{directory.object(), "child"};
    MakeDir(directory.object());
    directory.MakeAll();
    child.MakeAll();
    EXPECT_EQ(0, MAVOEARemove((directory.object() + "/").c_str(), 1, nullptr));
    EXPECT_FALSE(Exists(directory.ea_dir()));
    EXPECT_TRUE(Exists(child.stream()));
    EXPECT_TRUE(Exists(child.folder() + "/color"));
    // The path is reported as it was given.
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(IndexCall(directory.object() + "/"),
                                                 FileIndexCall(directory.object() + "/")));
}

// Promise: "MAVOEARemove: Removes"
TEST_F(EaRemoveTest, AnEaDirectoryWithFilesOfAnotherObjectIsKeptWithThem) {
    file_.MakeAll();
    other_.MakeAll();
    EXPECT_EQ(0, Remove(1));
    EXPECT_THAT(Left(),
                ElementsAre("._a.txt", "._other", "@eaDir/", "@eaDir/other/",
                            "@eaDir/other/MAVO:Resource", "@eaDir/other/color",
                            "@eaDir/other@MavoEAStream", "@eaDir/other@MavoResource", "a.txt"));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, OtherFilesOfTheObjectInItsEaDirectoryAreNotTouched) {
    file_.MakeAll();
    WriteFile(file_.ea_dir() + "/a.txt@Thumbnail", Ascii("of another service"));
    EXPECT_EQ(0, Remove(1));
    EXPECT_THAT(NamesIn(file_.ea_dir()), ElementsAre("a.txt@Thumbnail"));
}

// ---- The type that is found ---------------------------------------------------------------------

// Promise: "MAVOEARemove: 0, or -1"
TEST_F(EaRemoveTest, NullFailsWith0xD00AndDoesNothing) {
    TakeCallNames();
    for (const int type : {-1, 0, 1, 4, 7}) {
        EXPECT_EQ(-1, MAVOEARemove(nullptr, type, nullptr));
        ExpectOnly(0xD00, kUnit);
        EXPECT_EQ(-1, MAVOEARemoveWithoutEAStream(nullptr, type));
        ExpectOnly(0xD00, kUnit);
    }
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

// Promise: "Remove, rename and copy: `fsType` is"
TEST_F(EaRemoveTest, ATypeThatIsGivenIsNotAskedFor) {
    EXPECT_EQ(0, Remove(1));
    EXPECT_THAT(TakePlatformCalls(), Each(Not(StartsWith("MAVOGetFSType("))));
}

// Promise: "MAVOEARemove: 0x2A00"
TEST_F(EaRemoveTest, ATypeThatCannotBeFoundFailsWith0x2A00AndTellsNobody) {
    file_.MakeAll();
    const std::vector<std::string> before = Left();
    Platform().fs_type = [](const std::string&, int) { return -1; };
    EXPECT_EQ(-1, Remove(-1));
    ExpectOnly(0x2A00, kUnit);
    EXPECT_EQ(-1, MAVOEARemoveWithoutEAStream(file_.object().c_str(), -1));
    ExpectOnly(0x2A00, kUnit);
    EXPECT_EQ(before, Left());
    const std::string question = "MAVOGetFSType(" + dir_.path() + ", 1)";
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(question, question));
    EXPECT_THAT(archived_, IsEmpty());
}

// With the process in the test's directory.
class EaRemoveHereTest : public EaRemoveTest {
 protected:
    void SetUp() override {
        EaRemoveTest::SetUp();
        former_ = std::filesystem::current_path();
        std::filesystem::current_path(dir_.path());
    }
    void TearDown() override {
        std::filesystem::current_path(former_);
        EaRemoveTest::TearDown();
    }
    // The path that the type is asked of.
    static std::string AskedOf(const std::string& path) {
        std::string asked = "(nothing)";
        Platform().fs_type = [&](const std::string& of, int flag) {
            EXPECT_EQ(1, flag);
            asked = of;
            return 4;
        };
        EXPECT_EQ(0, MAVOEARemove(path.c_str(), -1, nullptr));
        ExpectNothingReported();
        return asked;
    }
    std::string Here() const { return std::filesystem::current_path().string(); }

    std::filesystem::path former_;
};

// Promise: "MAVOEARemove: 0x2A00"
TEST_F(EaRemoveHereTest, TheTypeIsThatOfTheParentDirectory) {
    EXPECT_EQ("/v/share", AskedOf("/v/share/a"));
    EXPECT_EQ("/v/share/a", AskedOf("/v/share/a/"));
    EXPECT_EQ("/v/share/", AskedOf("/v/share//a"));
    EXPECT_EQ("", AskedOf("/a"));
    EXPECT_EQ("", AskedOf("/"));
    EXPECT_EQ("share", AskedOf("share/a"));
    EXPECT_EQ("..", AskedOf("../a"));
}

TEST_F(EaRemoveHereTest, ABareNameThatExistsIsAskedForItself) {
    EXPECT_EQ("a.txt", AskedOf("a.txt"));
}

TEST_F(EaRemoveHereTest, ABareNameThatIsMissingIsOneInTheCurrentDirectory) {
    EXPECT_EQ(Here(), AskedOf("missing"));
    EXPECT_EQ(Here(), AskedOf(""));
    ASSERT_EQ(0, ::symlink("nowhere", "dangling"));
    EXPECT_EQ(Here(), AskedOf("dangling"));
}

TEST_F(EaRemoveHereTest, TheTypeIsAskedOfNoMoreThanTheFirst4095Bytes) {
    const std::string half(2500, 'a');
    EXPECT_EQ("/" + half, AskedOf("/" + half + "/" + half));
    // The slash at the last byte that counts, and at the first that does not.
    const std::string most(4093, 'a');
    EXPECT_EQ("/" + most, AskedOf("/" + most + "/b"));
    EXPECT_EQ("", AskedOf("/" + most + "a/b"));
}

// Promise: "MAVOEARemove: What is in the way"
TEST_F(EaRemoveHereTest, ACurrentDirectoryThatCannotBeToldIsLoggedAndFails) {
    TakeCalls();
    for (const int error : {ENOENT, ERANGE, EACCES}) {
        SCOPED_TRACE(strerror(error));
        const FailCall fault("getcwd", error);
        EXPECT_EQ(-1, MAVOEARemove("missing", -1, nullptr));
        EXPECT_TRUE(fault.fired());
        ExpectOnlyLogged(std::string("ea_remove:LINE Fail to getcwd. ") + strerror(error));
    }
    EXPECT_THAT(TakeCalls(), Contains("getcwd(4096)"));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

TEST_F(EaRemoveHereTest, TheCurrentDirectoryIsNotAskedForWhenTheNameExistsOrHasASlash) {
    TakeCallNames();
    EXPECT_EQ(0, MAVOEARemove("a.txt", -1, nullptr));
    EXPECT_EQ(0, MAVOEARemove("./missing", -1, nullptr));
    EXPECT_THAT(TakeCallNames(), Not(Contains("getcwd")));
}

TEST_F(EaRemoveHereTest, ABareNamesMetadataIsRemoved) {
    file_.MakeAll();
    EXPECT_EQ(0, MAVOEARemove("a.txt", -1, nullptr));
    EXPECT_THAT(Left(), ElementsAre("._a.txt", "a.txt"));
    file_.MakeAll();
    EXPECT_EQ(0, MAVOEARemove("a.txt", 0, nullptr));
    EXPECT_FALSE(Exists(file_.sidecar()));
    EXPECT_FALSE(Exists(file_.folder()));
    ExpectNothingReported();
}

// ---- AppleDouble volumes ------------------------------------------------------------------------

TEST_F(EaRemoveTest, WithoutASidecarTheLegacyFolderOfAnAppleDoubleVolumeStillGoes) {
    file_.MakeLegacy("color");
    EXPECT_EQ(0, Remove(0));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

// Promise: "MAVOEARemove: 0x3900"
// Promise: "MAVOEARemove: On types 0 and 5"
TEST_F(EaRemoveTest, ASidecarThatCannotBeRemovedFailsWith0x3900AndKeepsTheLegacyFolder) {
    for (const int error : {EACCES, EPERM, EROFS, ENOTDIR, EIO}) {
        SCOPED_TRACE(strerror(error));
        file_.MakeAll();
        const std::vector<std::string> before = Left();
        const FailCall fault("unlink", error);
        EXPECT_EQ(-1, Remove(0));
        ExpectOnly(0x3900, kUnit);
        EXPECT_EQ(before, Left());
        ExpectBothIndexesTold();
        EXPECT_THAT(archived_, IsEmpty());
    }
}

TEST_F(EaRemoveTest, ADirectoryInPlaceOfTheSidecarFailsWith0x3900) {
    MakeDir(file_.sidecar());
    EXPECT_EQ(-1, Remove(5));
    ExpectOnly(0x3900, kUnit);
    EXPECT_TRUE(Exists(file_.sidecar()));
    ExpectBothIndexesTold();
}

// Promise: "MAVOEARemove: On types 0 and 5"
TEST_F(EaRemoveTest, ALegacyFolderThatCannotBeRemovedIsNoFailureOfAnAppleDoubleVolume) {
    file_.MakeAll();
    MakeDir(file_.folder() + "/sub");
    std::filesystem::remove(file_.folder() + "/color");
    std::filesystem::remove(file_.folder() + "/MAVO:Resource");
    EXPECT_EQ(0, Remove(0));
    EXPECT_FALSE(Exists(file_.sidecar()));
    EXPECT_TRUE(Exists(file_.folder() + "/sub"));
    ExpectOnlyLogged("ea_remove:LINE Fail to remove " + file_.folder() + "/sub. " +
                     strerror(EISDIR));
    ExpectBothIndexesTold();
}

TEST_F(EaRemoveTest, ANameThatIsTooLongForASidecarHasNoneAndKeepsItsLegacyFolder) {
    for (const std::size_t size : {254u, 255u}) {
        SCOPED_TRACE(size);
        const ObjectFiles file{dir_.path(), std::string(size, 'n')};
        file.MakeObject();
        file.MakeLegacy("color");
        TakeCallNames();
        EXPECT_EQ(0, MAVOEARemove(file.object().c_str(), 0, nullptr));
        ExpectOnly(0xC300, "ea_adpath");
        EXPECT_TRUE(Exists(file.folder() + "/color"));
        EXPECT_THAT(TakeCallNames(), IsEmpty());
        EXPECT_THAT(TakePlatformCalls(),
                    ElementsAre(IndexCall(file.object()), FileIndexCall(file.object())));
    }
}

TEST_F(EaRemoveTest, TheLongestNameThatHasASidecarLosesIt) {
    const ObjectFiles file{dir_.path(), std::string(253, 'n')};
    file.MakeSidecar();
    file.MakeLegacy("color");
    EXPECT_EQ(0, MAVOEARemove(file.object().c_str(), 5, nullptr));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

// Promise: "MAVOEARemove: the path functions' codes"
TEST_F(EaRemoveTest, ASidecarPathThatCannotBeDerivedFailsAndTellsTheIndexes) {
    const std::string path = dir_.path() + std::string(5000, '/') + "a.txt";
    const FailCall fault("malloc", ENOMEM);
    EXPECT_EQ(-1, MAVOEARemove(path.c_str(), 0, nullptr));
    EXPECT_TRUE(fault.fired());
    ExpectOnly(0x200, "ea_adpath");
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(IndexCall(path), FileIndexCall(path)));
}

TEST_F(EaRemoveTest, ASidecarThatIsALinkGoesAndWhatItLeadsToStays) {
    WriteFile(dir_ / "target", Ascii("kept"));
    ASSERT_EQ(0, ::symlink((dir_ / "target").c_str(), file_.sidecar().c_str()));
    EXPECT_EQ(0, Remove(0));
    EXPECT_THAT(Left(), ElementsAre("a.txt", "target"));
}

// ---- EA-directory volumes: both forms are attempted ---------------------------------------------

TEST_F(EaRemoveTest, WithoutAnyMetadataTheIndexesAreToldAndTheArchiveBitIsSet) {
    TakeCallNames();
    EXPECT_EQ(0, Remove(1));
    ExpectBothIndexesTold();
    ExpectArchived();
    const auto calls = TakeCallNames();
    for (const char* const name : {"unlink", "remove", "rmdir", "opendir", "mkdir"}) {
        EXPECT_THAT(calls, Not(Contains(name)));
    }
    ExpectNothingReported();
}

// Promise: "MAVOEARemove: 0, or -1"
TEST_F(EaRemoveTest, ALegacyFolderThatFailsDoesNotKeepTheFilesFromBeingRemoved) {
    file_.MakeAll();
    const FailCall fault("remove", EACCES);  // the folder
    EXPECT_EQ(-1, Remove(1));
    ExpectOnly(0x3900, kUnit);
    EXPECT_THAT(Left(), ElementsAre("._a.txt", "@eaDir/", "@eaDir/a.txt/", "a.txt"));
    ExpectBothIndexesTold();
    ExpectArchived();
}

TEST_F(EaRemoveTest, FilesThatFailAfterTheLegacyFolderWentLeaveItGone) {
    file_.MakeAll();
    const FailCall fault("unlink", EACCES, 4);  // color, MAVO:Resource, @MavoResource, the stream
    EXPECT_EQ(-1, Remove(1));
    ExpectOnly(0x3900, kUnit);
    EXPECT_THAT(Left(), ElementsAre("._a.txt", "@eaDir/", "@eaDir/a.txt@MavoEAStream", "a.txt"));
    ExpectBothIndexesTold();
    ExpectArchived();
}

// Promise: "MAVOEARemove: What is in the way"
// Promise: "MAVOEARemove: 0x3900"
TEST_F(EaRemoveTest, BothFormsFailingFailOnce) {
    file_.MakeAll();
    MakeDir(file_.folder() + "/sub");
    const FailCall fault("unlink", EPERM, 0);
    EXPECT_EQ(-1, Remove(1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x3900, kUnit)));  // the files
    EXPECT_THAT(TakeLog(),                                             // the folder
                ElementsAre(StartsWith("ea_remove:LINE Fail to remove " + file_.folder() + "/")));
    ExpectBothIndexesTold();
    ExpectArchived();
}

TEST_F(EaRemoveTest, ALegacyFolderThatCannotBeOpenedStaysAndIsNoFailure) {
    file_.MakeAll();
    const FailCall fault("opendir", EACCES);
    EXPECT_EQ(0, Remove(1));
    ExpectOnly(0x900, kUnit);
    EXPECT_THAT(Left(), ElementsAre("._a.txt", "@eaDir/", "@eaDir/a.txt/",
                                    "@eaDir/a.txt/MAVO:Resource", "@eaDir/a.txt/color", "a.txt"));
}

// Promise: "MAVOEARemove: the path functions' codes"
// Promise: "MAVOEARemove: each of the two forms"
TEST_F(EaRemoveTest, APathThatIsTooLongFailsInBothFormsAndIsReported) {
    const std::string path = dir_.path() + "/" + std::string(5000, 'n');
    EXPECT_EQ(-1, MAVOEARemove(path.c_str(), 1, nullptr));
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0xC300, "ea_dir_path"), RecordOf(0xC300, "ea_dir_path")));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(IndexCall(path), FileIndexCall(path)));
    EXPECT_THAT(archived_, IsEmpty());
}

TEST_F(EaRemoveTest, EveryFailingCallStillTellsTheIndexesAndLeavesNothingOpen) {
    for (const int type : {0, 1}) {
        for (int nth = 1;; ++nth) {
            SCOPED_TRACE("type " + std::to_string(type) + ", call " + std::to_string(nth));
            ASSERT_LT(nth, 100);
            const TempDir dir;
            const ObjectFiles file{dir.path(), "a.txt"};
            file.MakeObject();
            file.MakeAll();
            TakePlatformCalls();
            const FailNthCall fault(nth, EIO);
            const int result = MAVOEARemove(file.object().c_str(), type, nullptr);
            EXPECT_THAT(TakePlatformCalls(),
                        ElementsAre(IndexCall(file.object()), FileIndexCall(file.object())));
            EXPECT_TRUE(Exists(file.object()));
            EXPECT_EQ(descriptors_, OpenDescriptors());
            EXPECT_EQ(live_blocks_, TakeAllocations().live);
            const auto records = TakeRecords();
            const auto log = TakeLog();
            if (!fault.fired()) {
                EXPECT_EQ(0, result);
                EXPECT_THAT(records, IsEmpty());
                EXPECT_THAT(log, IsEmpty());
                break;
            }
            if (fault.name() == "unlink" || fault.name() == "remove") {
                // Of an AppleDouble volume, only the sidecar counts.
                EXPECT_EQ(type == 1 || Exists(file.sidecar()) ? -1 : 0, result) << fault.name();
                EXPECT_EQ(1u, records.size() + log.size());
            } else if (fault.name() != "readdir") {
                EXPECT_EQ(0, result) << fault.name();
            }
        }
    }
}

// ---- The folder form ----------------------------------------------------------------------------

// Promise: "EARemove: Removes"
TEST_F(EaRemoveTest, TheFolderFormTakesTheLegacyFolderAndNothingElse) {
    file_.MakeAll();
    EXPECT_EQ(0, RemoveForm(0));
    EXPECT_THAT(Left(), ElementsAre("._a.txt", "@eaDir/", "@eaDir/a.txt@MavoEAStream",
                                    "@eaDir/a.txt@MavoResource", "a.txt"));
    ExpectNothingReported();
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_THAT(archived_, IsEmpty());
}

// Promise: "EARemove: then the EA directory"
TEST_F(EaRemoveTest, TheFolderFormTakesTheEaDirectoryToo) {
    file_.MakeLegacy("color");
    WriteFile(cover_, {});
    EXPECT_EQ(0, RemoveForm(0));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
}

TEST_F(EaRemoveTest, FilesOfEveryNameInTheLegacyFolderGo) {
    for (const std::string& name : OddNames()) file_.MakeLegacy(name);
    file_.MakeLegacy(std::string(255, 'n'));
    file_.MakeLegacy("...");
    file_.MakeLegacy(".cover");
    ASSERT_EQ(0, ::symlink(dir_.path().c_str(), (file_.folder() + "/link").c_str()));
    ASSERT_EQ(0, ::mkfifo((file_.folder() + "/fifo").c_str(), 0666));
    EXPECT_EQ(0, RemoveForm(0));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, OfALinkInTheFoldersPlaceOnlyTheLinkGoes) {
    const std::string elsewhere = dir_ / "elsewhere";
    MakeDir(elsewhere);
    WriteFile(elsewhere + "/precious", Ascii("another's"));
    MakeDir(file_.ea_dir());
    ASSERT_EQ(0, ::symlink(elsewhere.c_str(), file_.folder().c_str()));
    EXPECT_EQ(0, RemoveForm(0));
    EXPECT_THAT(Left(), ElementsAre("@eaDir/", "a.txt", "elsewhere/", "elsewhere/precious"));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, AnEmptyLegacyFolderGoesAndTheEaDirectoryStays) {
    file_.MakeFolder();
    EXPECT_EQ(0, RemoveForm(0));
    EXPECT_THAT(Left(), ElementsAre("@eaDir/", "a.txt"));
    ExpectNothingReported();
}

// Promise: "EARemove: -1: 0x3900"
// Promise: "MAVOEARemove: What is in the way"
TEST_F(EaRemoveTest, ASubfolderOfTheLegacyFolderIsLoggedAndFails) {
    MakeDir(file_.ea_dir());
    MakeDir(file_.folder());
    MakeDir(file_.folder() + "/sub");
    EXPECT_EQ(-1, RemoveForm(0));
    ExpectOnlyLogged("ea_remove:LINE Fail to remove " + file_.folder() + "/sub. " +
                     strerror(EISDIR));
    EXPECT_EQ(-1, Remove(1));
    ExpectOnlyLogged("ea_remove:LINE Fail to remove " + file_.folder() + "/sub. " +
                     strerror(EISDIR));
    EXPECT_TRUE(Exists(file_.folder() + "/sub"));
}

TEST_F(EaRemoveTest, AFileOfTheLegacyFolderThatFailsEndsTheRemovalThere) {
    for (const char* const name : {"one", "two", "three"}) file_.MakeLegacy(name);
    for (const int error : {EACCES, ENOENT}) {
        SCOPED_TRACE(strerror(error));
        TakeCallNames();
        const std::size_t before = NamesIn(file_.folder()).size();
        const FailCall fault("unlink", error, 2);
        EXPECT_EQ(-1, RemoveForm(0));
        EXPECT_EQ(before - 1, NamesIn(file_.folder()).size());
        EXPECT_THAT(TakeRecords(), IsEmpty());
        const auto log = TakeLog();
        ASSERT_EQ(1u, log.size());
        EXPECT_THAT(log[0], StartsWith("ea_remove:LINE Fail to remove " + file_.folder() + "/"));
        EXPECT_TRUE(log[0].ends_with(std::string(". ") + strerror(error))) << log[0];
        const auto calls = TakeCallNames();
        EXPECT_EQ(2, std::count(calls.begin(), calls.end(), "unlink"));
        for (const char* const later : {"remove", "rmdir"})
            EXPECT_THAT(calls, Not(Contains(later)));
        file_.MakeLegacy("four");
    }
}

TEST_F(EaRemoveTest, ALegacyFolderThatCannotBeRemovedFailsWith0x3900AndKeepsTheEaDirectory) {
    file_.MakeLegacy("color");
    const FailCall fault("remove", EBUSY);
    TakeCallNames();
    EXPECT_EQ(-1, RemoveForm(0));
    ExpectOnly(0x3900, kUnit);
    EXPECT_THAT(Left(), ElementsAre("@eaDir/", "@eaDir/a.txt/", "a.txt"));
    EXPECT_THAT(TakeCallNames(), Not(Contains("rmdir")));
}

TEST_F(EaRemoveTest, ALegacyFolderWhoseReadingBreaksOffFailsWith0x3900) {
    file_.MakeLegacy("color");
    const FailCall fault("readdir", EIO);
    EXPECT_EQ(-1, RemoveForm(0));
    ExpectOnly(0x3900, kUnit);
    EXPECT_TRUE(Exists(file_.folder() + "/color"));
}

// Promise: "EARemove: A folder that cannot be opened"
TEST_F(EaRemoveTest, AFileInPlaceOfTheLegacyFolderIsAFolderThatCannotBeOpened) {
    MakeDir(file_.ea_dir());
    WriteFile(file_.folder(), Ascii("in the way"));
    EXPECT_EQ(0, RemoveForm(0));
    ExpectOnly(0x900, kUnit);
    EXPECT_EQ(Ascii("in the way"), ReadFile(file_.folder()));
}

TEST_F(EaRemoveTest, ALegacyFolderThatCannotBeLookedUpCountsAsMissing) {
    file_.MakeLegacy("color");
    TakeCallNames();
    const FailCall fault("access", EACCES);
    EXPECT_EQ(0, RemoveForm(0));
    EXPECT_THAT(TakeCallNames(), ElementsAre("access"));
    ExpectNothingReported();
}

// Slashes make a path long that is short to the kernel.
std::string Stretched(const std::string& parent, const std::string& name, std::size_t size) {
    return parent + std::string(size - parent.size() - name.size(), '/') + name;
}

TEST_F(EaRemoveTest, AnEntryWhosePathTheKernelDoesNotTakeIsLoggedWhole) {
    const std::string entry(40, 'e');
    file_.MakeLegacy(entry);
    const std::string object = Stretched(dir_.path(), "a.txt", 4070);
    const std::string folder = object.substr(0, 4065) + "@eaDir/a.txt";
    ASSERT_EQ(4077u, folder.size());
    EXPECT_EQ(-1, EARemove(0, object.c_str()));
    ExpectOnlyLogged("ea_remove:LINE Fail to remove " + folder + "/" + entry + ". " +
                     strerror(ENAMETOOLONG));
    EXPECT_TRUE(Exists(file_.folder() + "/" + entry));
}

TEST_F(EaRemoveTest, APathMayFillTheBuffersOf4095Bytes) {
    file_.MakeLegacy("color");
    const std::string longest = Stretched(dir_.path(), "a.txt", 4088);
    EXPECT_EQ(0, EARemove(2, longest.c_str()));
    ExpectNothingReported();
    EXPECT_EQ(-1, EARemove(0, ("/" + longest).c_str()));
    ExpectOnly(0xC300, "ea_dir_path");
    // "@MavoResource" and "@MavoEAStream" take more.
    const std::string object = Stretched(dir_.path(), "a.txt", 4074);
    file_.MakeStream();
    file_.MakeResource();
    EXPECT_EQ(0, EARemove(1, object.c_str()));
    EXPECT_FALSE(Exists(file_.stream()));
    EXPECT_FALSE(Exists(file_.resource()));
    ExpectNothingReported();
}

// ---- The file form ------------------------------------------------------------------------------

// Promise: "EARemove: Removes"
TEST_F(EaRemoveTest, TheFileFormTakesTheTwoFilesAndNothingElse) {
    file_.MakeAll();
    other_.MakeStream();
    EXPECT_EQ(0, RemoveForm(1));
    EXPECT_THAT(Left(),
                ElementsAre("._a.txt", "@eaDir/", "@eaDir/a.txt/", "@eaDir/a.txt/MAVO:Resource",
                            "@eaDir/a.txt/color", "@eaDir/other@MavoEAStream", "a.txt"));
    ExpectNothingReported();
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_THAT(archived_, IsEmpty());
}

TEST_F(EaRemoveTest, TheResourceFileGoesFirst) {
    file_.MakeAll();
    TakeCalls();
    EXPECT_EQ(0, RemoveForm(1));
    std::vector<std::string> unlinks = TakeCalls();
    std::erase_if(unlinks, [](const auto& call) { return !call.starts_with("unlink("); });
    EXPECT_THAT(unlinks,
                ElementsAre("unlink(" + file_.resource() + ")", "unlink(" + file_.stream() + ")"));
}

TEST_F(EaRemoveTest, OneOfTheTwoFilesIsEnough) {
    file_.MakeStream();
    EXPECT_EQ(0, RemoveForm(1));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    file_.MakeResource();
    EXPECT_EQ(0, RemoveForm(1));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

// Promise: "EARemove: 0, also when"
TEST_F(EaRemoveTest, AnEmptyEaDirectoryGoesWithAnObjectThatHasNoFilesInIt) {
    MakeDir(file_.ea_dir());
    EXPECT_EQ(0, RemoveForm(1));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, AFileInPlaceOfTheEaDirectoryIsLoggedAndNoFailure) {
    WriteFile(file_.ea_dir(), Ascii("in the way"));
    EXPECT_EQ(0, RemoveForm(1));
    ExpectOnlyLogged("ea_remove:LINE Failed to opendir " + file_.ea_dir() +
                     ", reason=" + strerror(ENOTDIR) + ".");
    EXPECT_EQ(Ascii("in the way"), ReadFile(file_.ea_dir()));
}

TEST_F(EaRemoveTest, FilesThatCannotBeForTheirDirectorysSakeCountAsRemoved) {
    for (const int error : {ENOENT, ENOTDIR}) {
        SCOPED_TRACE(strerror(error));
        MakeDir(file_.ea_dir());
        const FailCall fault("unlink", error, 0);
        EXPECT_EQ(0, RemoveForm(1));
        EXPECT_FALSE(Exists(file_.ea_dir()));
        ExpectNothingReported();
    }
}

TEST_F(EaRemoveTest, AResourceFileThatFailsDoesNotKeepTheStreamFromBeingRemoved) {
    for (const int error : {EACCES, EPERM, EISDIR, EIO}) {
        SCOPED_TRACE(strerror(error));
        file_.MakeStream();
        file_.MakeResource();
        TakeCallNames();
        const FailCall fault("unlink", error, 1);
        EXPECT_EQ(-1, RemoveForm(1));
        ExpectOnly(0x3900, kUnit);
        EXPECT_THAT(NamesIn(file_.ea_dir()), ElementsAre("a.txt@MavoResource"));
        EXPECT_THAT(TakeCallNames(), Not(Contains("rmdir")));
    }
}

// Promise: "EARemove: -1: 0x3900"
TEST_F(EaRemoveTest, AStreamThatFailsIsRecordedOnceAndKeepsTheEaDirectory) {
    for (const int error : {EACCES, EPERM, EISDIR, EIO}) {
        SCOPED_TRACE(strerror(error));
        file_.MakeStream();
        file_.MakeResource();
        TakeCallNames();
        const FailCall fault("unlink", error, 2);
        EXPECT_EQ(-1, RemoveForm(1));
        ExpectOnly(0x3900, kUnit);
        EXPECT_THAT(NamesIn(file_.ea_dir()), ElementsAre("a.txt@MavoEAStream"));
        EXPECT_THAT(TakeCallNames(), Not(Contains("rmdir")));
    }
}

TEST_F(EaRemoveTest, BothFilesFailingAreRecordedOnce) {
    file_.MakeStream();
    file_.MakeResource();
    const FailCall fault("unlink", EACCES, 0);
    EXPECT_EQ(-1, RemoveForm(1));
    ExpectOnly(0x3900, kUnit);
    EXPECT_THAT(NamesIn(file_.ea_dir()), ElementsAre("a.txt@MavoEAStream", "a.txt@MavoResource"));
}

TEST_F(EaRemoveTest, FilePathsThatCannotBeDerivedFailWith0x3900) {
    file_.MakeStream();
    file_.MakeResource();
    // The EA directory's path still fits.
    const std::string object = Stretched(dir_.path(), "a.txt", 4075);
    EXPECT_EQ(-1, EARemove(1, object.c_str()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xC300, "ea_path"), RecordOf(0xC300, "ea_path"),
                                           RecordOf(0x3900, kUnit)));
    EXPECT_EQ(-1, MAVOEARemoveWithoutEAStream(object.c_str(), 1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xC300, "ea_path"), RecordOf(0x3900, kUnit)));
    EXPECT_TRUE(Exists(file_.stream()));
    EXPECT_TRUE(Exists(file_.resource()));
}

TEST_F(EaRemoveTest, AnyOtherFormDoesNothing) {
    file_.MakeAll();
    const std::vector<std::string> before = Left();
    for (const int form : {-1, 2, 3, 256}) {
        SCOPED_TRACE(form);
        EXPECT_EQ(0, RemoveForm(form));
    }
    MakeDir(dir_ / "empty");
    MakeDir(dir_ / "empty/@eaDir");
    EXPECT_EQ(0, EARemove(2, (dir_ / "empty/a").c_str()));
    EXPECT_TRUE(Exists(dir_ / "empty/@eaDir"));
    ASSERT_TRUE(std::filesystem::remove_all(dir_ / "empty") > 0);
    EXPECT_EQ(before, Left());
    ExpectNothingReported();
}

// Promise: "EARemove: the path functions' codes"
TEST_F(EaRemoveTest, APathThatIsNullOrEmptyFailsWithItsCode) {
    for (const int form : {0, 1}) {
        EXPECT_EQ(-1, EARemove(form, nullptr));
        ExpectOnly(0xD00, "ea_dir_path");
        EXPECT_EQ(-1, EARemove(form, ""));
        ExpectOnly(0xD00, "ea_dir_path");
    }
}

// ---- Keeping the stream -------------------------------------------------------------------------

TEST_F(EaRemoveTest, WithoutTheStreamAnEaDirectoryThatHadNoneGoes) {
    file_.MakeResource();
    EXPECT_EQ(0, MAVOEARemoveWithoutEAStream(file_.object().c_str(), 1));
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, TheStreamIsKeptByWhateverIsRemovedMeanwhile) {
    file_.MakeAll();
    other_.MakeAll();
    Platform().index = [&](const std::string&) {
        EXPECT_EQ(0, EARemove(1, other_.object().c_str()));
        return 0;
    };
    EXPECT_EQ(0, MAVOEARemoveWithoutEAStream(file_.object().c_str(), 1));
    EXPECT_TRUE(Exists(other_.stream()));
    EXPECT_FALSE(Exists(other_.resource()));
    EXPECT_TRUE(Exists(file_.stream()));
}

TEST_F(EaRemoveTest, AfterwardsStreamsAreRemovedAgainWhateverTheResultWas) {
    file_.MakeAll();
    EXPECT_EQ(0, MAVOEARemoveWithoutEAStream(file_.object().c_str(), 1));
    EXPECT_EQ(0, RemoveForm(1));
    EXPECT_FALSE(Exists(file_.stream()));

    file_.MakeStream();
    file_.MakeResource();
    {
        const FailCall fault("unlink", EACCES);
        EXPECT_EQ(-1, MAVOEARemoveWithoutEAStream(file_.object().c_str(), 1));
        ExpectOnly(0x3900, kUnit);
    }
    EXPECT_THAT(NamesIn(file_.ea_dir()), ElementsAre("a.txt@MavoEAStream", "a.txt@MavoResource"));
    EXPECT_EQ(0, Remove(1));
    EXPECT_FALSE(Exists(file_.stream()));

    file_.MakeStream();
    Platform().fs_type = [](const std::string&, int) { return -1; };
    EXPECT_EQ(-1, MAVOEARemoveWithoutEAStream(file_.object().c_str(), -1));
    ExpectOnly(0x2A00, kUnit);
    EXPECT_EQ(-1, MAVOEARemoveWithoutEAStream(nullptr, 1));
    ExpectOnly(0xD00, kUnit);
    EXPECT_EQ(0, RemoveForm(1));
    EXPECT_FALSE(Exists(file_.stream()));
}

// ---- Names --------------------------------------------------------------------------------------

TEST_F(EaRemoveTest, MetadataOfEveryNameIsRemoved) {
    for (const std::string& name : OddNames()) {
        SCOPED_TRACE(name);
        const ObjectFiles file{dir_.path(), name};
        file.MakeObject();
        file.MakeAll();
        EXPECT_EQ(0, MAVOEARemove(file.object().c_str(), 1, nullptr));
        EXPECT_FALSE(Exists(file.ea_dir()));
        EXPECT_EQ(0, MAVOEARemove(file.object().c_str(), 0, nullptr));
        EXPECT_FALSE(Exists(file.sidecar()));
        EXPECT_THAT(TakePlatformCalls(),
                    ElementsAre(IndexCall(file.object()), FileIndexCall(file.object()),
                                IndexCall(file.object()), FileIndexCall(file.object())));
        ExpectNothingReported();
    }
}

TEST_F(EaRemoveTest, NamesOfEveryLengthAreRemovedUnderTheirShortenedName) {
    // The byte sum from the 242nd byte on picks the last one: 2 * 97 = 3 * 60 + 14, 13 * 97 =
    // 21 * 60 + 1, 14 * 97 = 22 * 60 + 38.
    const std::string start(241, 'a');
    const std::vector<std::pair<std::size_t, std::string>> kNames = {
        {242, start + "a"}, {243, start + "e"}, {254, start + "2"}, {255, start + "="}};
    for (const auto& [size, shortened] : kNames) {
        SCOPED_TRACE(size);
        const ObjectFiles file{dir_.path(), std::string(size, 'a')};
        file.MakeObject();
        file.MakeLegacy("color");
        WriteFile(file.ea_dir() + "/" + shortened + "@MavoEAStream", Ascii("stream"));
        WriteFile(file.ea_dir() + "/" + shortened + "@MavoResource", Ascii("resource"));
        WriteFile(file.ea_dir() + "/" + start + "@MavoResource", Ascii("another's"));
        EXPECT_EQ(0, MAVOEARemove(file.object().c_str(), 1, nullptr));
        EXPECT_THAT(NamesIn(file.ea_dir()), ElementsAre(start + "@MavoResource"));
        ExpectNothingReported();
    }
}

// ---- The EA directory ---------------------------------------------------------------------------

// Promise: "EARemoveEADir: Removes"
TEST_F(EaRemoveTest, AnEmptyEaDirectoryIsRemovedWhateverPathInItIsGiven) {
    for (const char* const below : {"", "/", "/x", "/a.txt/color", "/x/@eaDir/y"}) {
        SCOPED_TRACE(below);
        MakeDir(file_.ea_dir());
        EXPECT_EQ(0, EARemoveEADir((file_.ea_dir() + below).c_str()));
        EXPECT_THAT(Left(), ElementsAre("a.txt"));
    }
    ExpectNothingReported();
}

// Promise: "EARemoveEADir: 0 when"
TEST_F(EaRemoveTest, AnEaDirectoryThatIsMissingIsAsGoodAsRemoved) {
    EXPECT_EQ(0, RemoveEaDir());
    EXPECT_EQ(0, EARemoveEADir((dir_ / "none/@eaDir/x").c_str()));
    ExpectNothingReported();
}

// Promise: "EARemoveEADir: -1 when"
TEST_F(EaRemoveTest, APathWithoutAnEaDirectoryFailsAndTouchesNothing) {
    MakeDir(dir_ / "@EADIR");
    TakeCallNames();
    for (const std::string& path :
         {std::string(), dir_.path(), dir_ / "@EADIR/x", dir_ / "eaDir"}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(-1, EARemoveEADir(path.c_str()));
    }
    EXPECT_EQ(-1, EARemoveEADir(nullptr));
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(Left(), ElementsAre("@EADIR/", "a.txt"));
    ExpectNothingReported();
}

// Promise: "EARemoveEADir: Removes"
TEST_F(EaRemoveTest, TheFirstEaDirInThePathCounts) {
    MakeDir(file_.ea_dir());
    MakeDir(file_.ea_dir() + "/sub");
    MakeDir(file_.ea_dir() + "/sub/@eaDir");
    EXPECT_EQ(-1, EARemoveEADir((file_.ea_dir() + "/sub/@eaDir/x").c_str()));
    EXPECT_TRUE(Exists(file_.ea_dir() + "/sub/@eaDir"));
}

TEST_F(EaRemoveTest, ADirectoryWhoseNameHasEaDirInItHidesTheOneBelow) {
    const ObjectFiles file{dir_ / "my@eaDirs", "a"};
    MakeDir(file.parent);
    file.MakeStream();
    EXPECT_EQ(0, MAVOEARemove(file.object().c_str(), 1, nullptr));
    EXPECT_THAT(Left(), ElementsAre("a.txt", "my@eaDirs/", "my@eaDirs/@eaDir/"));
    // It is the one before it that goes.
    MakeDir(dir_ / "my@eaDir");
    EXPECT_EQ(0, MAVOEARemove(file.object().c_str(), 1, nullptr));
    EXPECT_THAT(Left(), ElementsAre("a.txt", "my@eaDirs/", "my@eaDirs/@eaDir/"));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, APathIsLookedAtUpTo4096Bytes) {
    MakeDir(file_.ea_dir());
    const std::string parent = dir_.path();
    // Its last byte is the 4096th, which no path that the kernel takes has; and the 4097th.
    const std::string at_end = parent + std::string(4096 - parent.size() - 6, '/') + "@eaDir";
    EXPECT_EQ(-1, EARemoveEADir(at_end.c_str()));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_remove:LINE Failed to opendir " + at_end +
                                       ", reason=" + strerror(ENAMETOOLONG) + "."));
    TakeCallNames();
    EXPECT_EQ(-1, EARemoveEADir(("/" + at_end).c_str()));
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    const std::string fits = parent + "/@eaDir";
    EXPECT_EQ(0, EARemoveEADir((fits + std::string(10000, 'x')).c_str()));
    EXPECT_FALSE(Exists(file_.ea_dir()));
    ExpectNothingReported();
}

// Promise: "EARemoveEADir: Removes"
TEST_F(EaRemoveTest, ACoverDoesNotKeepTheEaDirectory) {
    MakeDir(file_.ea_dir());
    WriteFile(cover_, Ascii("cover"));
    EXPECT_EQ(0, RemoveEaDir());
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, ACoverBesideSomethingElseStaysWithIt) {
    for (const char* const name : {"other@MavoEAStream", ".Cover", ".cover2", "cover", ".cove"}) {
        SCOPED_TRACE(name);
        MakeDir(file_.ea_dir());
        WriteFile(cover_, Ascii("cover"));
        WriteFile(file_.ea_dir() + "/" + name, {});
        EXPECT_EQ(-1, RemoveEaDir());
        EXPECT_EQ(2u, NamesIn(file_.ea_dir()).size());
        ASSERT_EQ(0, ::unlink((file_.ea_dir() + "/" + name).c_str()));
    }
    EXPECT_EQ(Ascii("cover"), ReadFile(cover_));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, ACoverThatLeadsToAFileIsACoverAndTheFileStays) {
    MakeDir(file_.ea_dir());
    ASSERT_EQ(0, ::symlink(file_.object().c_str(), cover_.c_str()));
    EXPECT_EQ(0, RemoveEaDir());
    EXPECT_THAT(Left(), ElementsAre("a.txt"));
}

// Promise: "EARemoveEADir: Removes"
TEST_F(EaRemoveTest, ACoverThatIsNoFileKeepsTheEaDirectory) {
    const std::vector<std::function<int()>> kinds = {
        [&] { return ::mkdir(cover_.c_str(), 0777); },
        [&] { return ::mkfifo(cover_.c_str(), 0666); },
        [&] { return ::symlink(dir_.path().c_str(), cover_.c_str()); },
        [&] { return ::symlink("nowhere", cover_.c_str()); },
        [&] { return ::symlink(".cover", cover_.c_str()); },
    };
    for (std::size_t i = 0; i < kinds.size(); ++i) {
        SCOPED_TRACE(i);
        MakeDir(file_.ea_dir());
        ASSERT_EQ(0, kinds[i]());
        EXPECT_EQ(-1, RemoveEaDir());
        EXPECT_TRUE(Exists(cover_));
        std::filesystem::remove(cover_);
    }
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, ACoverThatCannotBeLookedAtKeepsTheEaDirectory) {
    MakeDir(file_.ea_dir());
    WriteFile(cover_, {});
    const FailCall fault("stat", EACCES);
    EXPECT_EQ(-1, RemoveEaDir());
    EXPECT_TRUE(Exists(cover_));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, ACoverThatCannotBeRemovedKeepsTheEaDirectoryInSilence) {
    MakeDir(file_.ea_dir());
    WriteFile(cover_, {});
    const FailCall fault("unlink", EACCES);
    EXPECT_EQ(-1, RemoveEaDir());
    EXPECT_TRUE(fault.fired());
    EXPECT_TRUE(Exists(cover_));
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, ACoverThatIsGoneBeforeItsRemovalIsAsGoodAsRemoved) {
    MakeDir(file_.ea_dir());
    WriteFile(cover_, {});
    Hooks().before = [&](const std::string& name) {
        if (name == "unlink") ::unlink(cover_.c_str());
    };
    EXPECT_EQ(0, RemoveEaDir());
    EXPECT_FALSE(Exists(file_.ea_dir()));
    ExpectNothingReported();
}

// Promise: "EARemoveEADir: -1 when"
// Promise: "EARemoveEADir: No codes"
TEST_F(EaRemoveTest, AnEaDirectoryThatCannotBeRemovedStaysInSilenceWithoutItsCover) {
    MakeDir(file_.ea_dir());
    WriteFile(cover_, {});
    const FailCall fault("remove", EBUSY);
    EXPECT_EQ(-1, RemoveEaDir());
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(Left(), ElementsAre("@eaDir/", "a.txt"));
    ExpectNothingReported();
}

// Promise: "EARemoveEADir: No codes"
TEST_F(EaRemoveTest, AnEaDirectoryThatCannotBeOpenedIsLoggedAndStays) {
    MakeDir(file_.ea_dir());
    WriteFile(cover_, {});
    for (const int error : {EACCES, EMFILE, ENOTDIR, ENOMEM}) {
        SCOPED_TRACE(strerror(error));
        const FailCall fault("opendir", error);
        EXPECT_EQ(-1, RemoveEaDir());
        EXPECT_TRUE(fault.fired());
        ExpectOnlyLogged("ea_remove:LINE Failed to opendir " + file_.ea_dir() +
                         ", reason=" + strerror(error) + ".");
    }
    EXPECT_TRUE(Exists(cover_));
}

TEST_F(EaRemoveTest, AnEaDirectoryThatIsGoneWhenItIsOpenedIsAsGoodAsRemoved) {
    MakeDir(file_.ea_dir());
    WriteFile(cover_, {});
    const FailCall fault("opendir", ENOENT);
    EXPECT_EQ(0, RemoveEaDir());
    EXPECT_TRUE(fault.fired());
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, AFileInPlaceOfTheEaDirectoryIsLogged) {
    WriteFile(file_.ea_dir(), Ascii("in the way"));
    EXPECT_EQ(-1, RemoveEaDir());
    ExpectOnlyLogged("ea_remove:LINE Failed to opendir " + file_.ea_dir() +
                     ", reason=" + strerror(ENOTDIR) + ".");
    EXPECT_TRUE(Exists(file_.ea_dir()));
}

TEST_F(EaRemoveTest, AnEaDirectoryThatTheKernelWillNotRemoveAtOnceIsLookedInto) {
    for (const int error : {EACCES, EPERM, EBUSY, EIO}) {
        SCOPED_TRACE(strerror(error));
        MakeDir(file_.ea_dir());
        {
            const FailCall fault("rmdir", error, 0);
            EXPECT_EQ(0, RemoveEaDir());
        }
        EXPECT_FALSE(Exists(file_.ea_dir()));
        other_.MakeStream();
        const FailCall fault("rmdir", error, 0);
        EXPECT_EQ(-1, RemoveEaDir());
        EXPECT_TRUE(Exists(other_.stream()));
        std::filesystem::remove_all(file_.ea_dir());
    }
    ExpectNothingReported();
}

TEST_F(EaRemoveTest, AnEaDirectoryThatIsALinkStaysAndNothingIsRemovedThroughIt) {
    const std::string target = dir_ / "target";
    MakeDir(target);
    ASSERT_EQ(0, ::symlink(target.c_str(), file_.ea_dir().c_str()));
    WriteFile(target + "/.cover", {});
    EXPECT_EQ(-1, RemoveEaDir());
    EXPECT_THAT(Left(), ElementsAre("@eaDir", "a.txt", "target/", "target/.cover"));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_remove:LINE Failed to opendir " + file_.ea_dir() +
                                       ", reason=" + strerror(ENOTDIR) + "."));
}

TEST_F(EaRemoveTest, ALargeEaDirectoryIsNotRead) {
    MakeDir(file_.ea_dir());
    for (int i = 0; i < 3000; ++i) {
        const std::string path = file_.ea_dir() + "/" + std::to_string(i) + "@MavoEAStream";
        const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT, 0666);
        ASSERT_LE(0, fd);
        ::close(fd);
    }
    TakeCallNames();
    EXPECT_EQ(-1, RemoveEaDir());
    std::vector<std::string> calls = TakeCallNames();
    EXPECT_GE(2u, calls.size());
    EXPECT_THAT(calls, Not(Contains("opendir")));
    EXPECT_THAT(calls, Not(Contains("readdir")));

    file_.MakeStream();
    file_.MakeResource();
    EXPECT_EQ(0, Remove(1));
    calls = TakeCallNames();
    EXPECT_THAT(calls, Not(Contains("opendir")));
    EXPECT_THAT(calls, Not(Contains("readdir")));

    // With a cover it is, up to the first other entry.
    WriteFile(cover_, {});
    EXPECT_EQ(-1, RemoveEaDir());
    calls = TakeCallNames();
    EXPECT_GE(4, std::count(calls.begin(), calls.end(), "readdir"));
    EXPECT_TRUE(Exists(cover_));
    ExpectNothingReported();
}

// ---- As another user ----------------------------------------------------------------------------

TEST_F(EaRemoveTest, WhoMayNotWriteTheEaDirectoryFailsWith0x3900AndLosesNothing) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    file_.MakeStream();
    file_.MakeResource();
    ASSERT_EQ(0, ::chmod(file_.ea_dir().c_str(), 0755));
    AsUser(kNobody, Root::kGivenUp, [this] {
        EXPECT_EQ(-1, Remove(1));
        ExpectOnly(0x3900, kUnit);
        ExpectBothIndexesTold();
    });
    EXPECT_TRUE(Exists(file_.stream()));
    EXPECT_TRUE(Exists(file_.resource()));
}

TEST_F(EaRemoveTest, WhoMayNotReadTheEaDirectoryLogsThatAndLeavesIt) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    other_.MakeStream();
    ASSERT_EQ(0, ::chmod(file_.ea_dir().c_str(), 0));
    AsUser(kNobody, Root::kGivenUp, [this] {
        EXPECT_EQ(-1, RemoveEaDir());
        ExpectOnlyLogged("ea_remove:LINE Failed to opendir " + file_.ea_dir() +
                         ", reason=" + strerror(EACCES) + ".");
    });
    EXPECT_TRUE(Exists(other_.stream()));
}

TEST_F(EaRemoveTest, WhoMayNotReadALegacyFolderLeavesIt) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    file_.MakeLegacy("color");
    ASSERT_EQ(0, ::chmod(file_.folder().c_str(), 0));
    AsUser(kNobody, Root::kGivenUp, [this] {
        EXPECT_EQ(0, RemoveForm(0));
        ExpectOnly(0x900, kUnit);
    });
    EXPECT_TRUE(Exists(file_.folder() + "/color"));
}

// ---- Directories that hold nothing but an EA directory ------------------------------------------

class DanglingEaDirTest : public EaRemoveTest {
 protected:
    void SetUp() override {
        EaRemoveTest::SetUp();
        MakeDir(holder_);
    }
    void Fill() const {
        const ObjectFiles gone{holder_, "gone"};
        gone.MakeStream();
        gone.MakeLegacy("color");
        MakeDir(holder_ + "/@eaDir/deep");
        MakeDir(holder_ + "/@eaDir/deep/deeper");
    }
    static std::string RmCall(const std::string& path) {
        return "MLIBCExec(/bin/rm, -rf, " + path + ")";
    }
    void RemoveDangling() const { MAVOEARemoveDanglingEADir(holder_.c_str()); }
    void ExpectNothingDone() const {
        EXPECT_THAT(TakePlatformCalls(), IsEmpty());
        ExpectNothingReported();
    }

    const std::string holder_ = dir_ / "holder";
};

// Promise: "MAVOEARemoveDanglingEADir: Removes"
TEST_F(DanglingEaDirTest, AnEaDirectoryThatIsAloneIsRemovedWithEverythingInIt) {
    Fill();
    RemoveDangling();
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(RmCall(holder_ + "/@eaDir")));
    EXPECT_TRUE(Exists(holder_));
    EXPECT_THAT(NamesIn(holder_), IsEmpty());
    ExpectNothingReported();
}

TEST_F(DanglingEaDirTest, AnEmptyDirectoryIsLeftAlone) {
    RemoveDangling();
    ExpectNothingDone();
    EXPECT_TRUE(Exists(holder_));
}

// Promise: "MAVOEARemoveDanglingEADir: Removes"
TEST_F(DanglingEaDirTest, AnyOtherEntryKeepsTheEaDirectory) {
    for (const char* const name :
         {"file", ".hidden", "...", "@eaDir2", "@EADIR", "._x", ".cover"}) {
        SCOPED_TRACE(name);
        Fill();
        WriteFile(holder_ + "/" + name, {});
        RemoveDangling();
        ExpectNothingDone();
        EXPECT_TRUE(Exists(holder_ + "/@eaDir/gone@MavoEAStream"));
        ASSERT_EQ(0, ::unlink((holder_ + "/" + name).c_str()));
    }
}

TEST_F(DanglingEaDirTest, AnotherEntryAloneIsLeftAlone) {
    WriteFile(holder_ + "/file", {});
    RemoveDangling();
    ExpectNothingDone();
    ASSERT_EQ(0, ::unlink((holder_ + "/file").c_str()));
    MakeDir(holder_ + "/@EADIR");
    RemoveDangling();
    ExpectNothingDone();
    EXPECT_TRUE(Exists(holder_ + "/@EADIR"));
}

TEST_F(DanglingEaDirTest, TheWalkEndsAtTheFirstOtherEntry) {
    Fill();
    for (int i = 0; i < 50; ++i) WriteFile(holder_ + "/" + std::to_string(i), {});
    TakeCallNames();
    RemoveDangling();
    const auto calls = TakeCallNames();
    EXPECT_GE(4, std::count(calls.begin(), calls.end(), "readdir"));
    EXPECT_EQ(1, std::count(calls.begin(), calls.end(), "closedir"));
    ExpectNothingDone();
}

TEST_F(DanglingEaDirTest, WhatStandsUnderTheNameIsNotInspected) {
    WriteFile(holder_ + "/@eaDir", Ascii("a file"));
    RemoveDangling();
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(RmCall(holder_ + "/@eaDir")));
    EXPECT_THAT(NamesIn(holder_), IsEmpty());

    MakeDir(dir_ / "target");
    WriteFile(dir_ / "target/file", {});
    ASSERT_EQ(0, ::symlink((dir_ / "target").c_str(), (holder_ + "/@eaDir").c_str()));
    RemoveDangling();
    EXPECT_THAT(NamesIn(holder_), IsEmpty());
    EXPECT_TRUE(Exists(dir_ / "target/file"));
}

TEST_F(DanglingEaDirTest, ThePathIsPassedOnAsItWasGiven) {
    Fill();
    MAVOEARemoveDanglingEADir((holder_ + "/").c_str());
    EXPECT_THAT(TakePlatformCalls(), ElementsAre(RmCall(holder_ + "//@eaDir")));
    EXPECT_THAT(NamesIn(holder_), IsEmpty());
}

TEST_F(DanglingEaDirTest, DirectoriesOfEveryNameAreCleaned) {
    for (const std::string& name : OddNames()) {
        SCOPED_TRACE(name);
        const std::string holder = dir_ / name;
        MakeDir(holder);
        MakeDir(holder + "/@eaDir");
        MAVOEARemoveDanglingEADir(holder.c_str());
        EXPECT_THAT(TakePlatformCalls(), ElementsAre(RmCall(holder + "/@eaDir")));
        EXPECT_THAT(NamesIn(holder), IsEmpty());
    }
    EXPECT_TRUE(Exists(file_.object()));
    ExpectNothingReported();
}

TEST_F(DanglingEaDirTest, APathOfAnyLengthIsPassedOnWhole) {
    Fill();
    for (const std::size_t size : {2000u, 4090u, 4095u}) {
        const std::string holder = Stretched(dir_.path(), "holder", size);
        Platform().exec = [](const std::vector<std::string>&) { return 0; };
        MAVOEARemoveDanglingEADir(holder.c_str());
        EXPECT_THAT(TakePlatformCalls(), ElementsAre(RmCall(holder + "/@eaDir")));
    }
    ExpectNothingReported();
}

TEST_F(DanglingEaDirTest, WhateverTheProgramAnswersIsIgnored) {
    for (const int status : {-1, 1, 127}) {
        SCOPED_TRACE(status);
        Fill();
        Platform().exec = [status](const std::vector<std::string>&) { return status; };
        RemoveDangling();
        EXPECT_THAT(TakePlatformCalls(), ElementsAre(RmCall(holder_ + "/@eaDir")));
        ExpectNothingReported();
    }
}

// Promise: "MAVOEARemoveDanglingEADir: NULL is none"
TEST_F(DanglingEaDirTest, NullIsNoDirectory) {
    TakeCallNames();
    MAVOEARemoveDanglingEADir(nullptr);
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    ExpectNothingDone();
}

// Promise: "MAVOEARemoveDanglingEADir: No codes"
TEST_F(DanglingEaDirTest, ADirectoryThatCannotBeOpenedIsLogged) {
    MAVOEARemoveDanglingEADir((dir_ / "none").c_str());
    ExpectOnlyLogged("ea_remove_dangling_eadir:LINE failed to opendir [" + (dir_ / "none") +
                     "], errno=" + strerror(ENOENT));
    MAVOEARemoveDanglingEADir(file_.object().c_str());
    ExpectOnlyLogged("ea_remove_dangling_eadir:LINE failed to opendir [" + file_.object() +
                     "], errno=" + strerror(ENOTDIR));
    MAVOEARemoveDanglingEADir("");
    ExpectOnlyLogged(std::string("ea_remove_dangling_eadir:LINE failed to opendir [], errno=") +
                     strerror(ENOENT));
    Fill();
    const FailCall fault("opendir", EMFILE);
    RemoveDangling();
    ExpectOnlyLogged("ea_remove_dangling_eadir:LINE failed to opendir [" + holder_ +
                     "], errno=" + strerror(EMFILE));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_TRUE(Exists(holder_ + "/@eaDir/gone@MavoEAStream"));
}

TEST_F(DanglingEaDirTest, WithoutMemoryItIsLeftInSilence) {
    Fill();
    const FailCall fault("malloc", ENOMEM);
    RemoveDangling();
    EXPECT_TRUE(fault.fired());
    ExpectNothingDone();
    EXPECT_TRUE(Exists(holder_ + "/@eaDir/gone@MavoEAStream"));
}

TEST_F(DanglingEaDirTest, AWalkThatBreaksOffTooEarlyRemovesNothing) {
    Fill();
    for (int nth = 1; nth <= 3; ++nth) {  // ".", ".." and "@eaDir"
        SCOPED_TRACE(nth);
        const FailCall fault("readdir", EIO, nth);
        RemoveDangling();
        EXPECT_TRUE(fault.fired());
        ExpectNothingDone();
    }
    EXPECT_TRUE(Exists(holder_ + "/@eaDir/gone@MavoEAStream"));
}

}  // namespace
}  // namespace mavoea::test

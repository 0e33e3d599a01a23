// Creating EA directories: as the superuser, open to everyone, with the platform's ACL.

#include <errno.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <map>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;

constexpr char kUnit[] = "ea_mkdir.c";
constexpr uid_t kUser = 1000;

class EaMkdirTest : public ::testing::Test, protected Identity {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        BeUser(0);
        Hooks().setxattr = [this](const char* path, const char* name, const void* value,
                                  size_t size, int) {
            const auto* const bytes = static_cast<const std::uint8_t*>(value);
            attributes_[std::string(path) + " " + name] = Bytes(bytes, bytes + size);
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

    static void ExpectOnly(int code) {
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, kUnit)));
        EXPECT_THAT(TakeLog(), IsEmpty());
    }

    static std::vector<std::string> PlatformCallsFor(const std::string& path) {
        return {"MAVOGetFSType(" + path + ", 0)", "MAVOACLSetEADirACL(" + path + ")"};
    }

    // Puts a symbolic link to `victim` in the place of `directory`.
    static void SwapForLink(const std::string& directory, const std::string& victim) {
        ASSERT_EQ(0, rename(directory.c_str(), (directory + ".moved").c_str()));
        ASSERT_EQ(0, symlink(victim.c_str(), directory.c_str()));
    }

    std::string MakeVictim() const {
        const std::string victim = dir_ / "victim";
        EXPECT_EQ(0, ::mkdir(victim.c_str(), 0700));
        EXPECT_EQ(0, ::chmod(victim.c_str(), 0700));
        return victim;
    }

    TempDir dir_;
    const std::string ea_dir_ = dir_ / "@eaDir";
    const std::string folder_ = ea_dir_ + "/name";
    std::map<std::string, Bytes> attributes_;  // by "<path> <name>"
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// ---- What it makes --------------------------------------------------------------------------

// Promise: "MAVOEAMKDir: Creates the EA directory"
// Promise: "Where metadata lies: `D/@eaDir` has mode 0777"
TEST_F(EaMkdirTest, MakesADirectoryForEveryone) {
    EXPECT_EQ(0, MAVOEAMKDir(0, ea_dir_.c_str()));
    struct stat info;
    ASSERT_EQ(0, lstat(ea_dir_.c_str(), &info));
    EXPECT_TRUE(S_ISDIR(info.st_mode));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_EQ(PlatformCallsFor(ea_dir_), TakePlatformCalls());
    ExpectNothingReported();
}

TEST_F(EaMkdirTest, TheUmaskDoesNotNarrowTheMode) {
    for (const mode_t mask : {0u, 022u, 077u, 0777u}) {
        SCOPED_TRACE(mask);
        if (mask == 0777 && !RunsAsRoot()) continue;  // needs what the superuser may
        const TempDir parent;
        const Umask umask(mask);
        const std::string outer = parent / "@eaDir";
        const std::string inner = outer + "/name";
        EXPECT_EQ(0, MAVOEAMKDir(1, inner.c_str()));
        EXPECT_EQ(0777, ModeOf(outer));
        EXPECT_EQ(0777, ModeOf(inner));
    }
    ExpectNothingReported();
}

TEST_F(EaMkdirTest, AsksForMode0777BeforeItWidensIt) {
    TakeCalls();
    EXPECT_EQ(0, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_THAT(TakeCalls(), Contains("mkdir(" + ea_dir_ + ", 0777)"));
}

// Promise: "MAVOEAMKDir: Creates the EA directory"
TEST_F(EaMkdirTest, WithParentFirstMakesBothOutermostFirst) {
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_EQ(0777, ModeOf(folder_));
    EXPECT_THAT(
        TakePlatformCalls(),
        ElementsAre("MAVOGetFSType(" + ea_dir_ + ", 0)", "MAVOACLSetEADirACL(" + ea_dir_ + ")",
                    "MAVOGetFSType(" + folder_ + ", 0)", "MAVOACLSetEADirACL(" + folder_ + ")"));
    ExpectNothingReported();
}

TEST_F(EaMkdirTest, AnyNonzeroParentFirstCounts) {
    EXPECT_EQ(0, MAVOEAMKDir(-3, folder_.c_str()));
    EXPECT_TRUE(Exists(folder_));
}

TEST_F(EaMkdirTest, WithoutParentFirstTheParentIsNotMade) {
    errno = 0;
    EXPECT_EQ(-1, MAVOEAMKDir(0, folder_.c_str()));
    EXPECT_EQ(ENOENT, errno);
    ExpectOnly(0x3C00);
    EXPECT_FALSE(Exists(ea_dir_));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

TEST_F(EaMkdirTest, ThePathOfTheCallerIsNotChanged) {
    std::string path = folder_;
    EXPECT_EQ(0, MAVOEAMKDir(1, path.data()));
    EXPECT_EQ(folder_, path);
}

TEST_F(EaMkdirTest, APathWithoutSlashIsRelativeToTheCurrentDirectory) {
    char before[4096];
    ASSERT_NE(nullptr, getcwd(before, sizeof before));
    ASSERT_EQ(0, chdir(dir_.path().c_str()));
    EXPECT_EQ(0, MAVOEAMKDir(0, "@eaDir"));
    ASSERT_EQ(0, chdir(before));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_THAT(TakePlatformCalls(),
                ElementsAre("MAVOGetFSType(@eaDir, 0)", "MAVOACLSetEADirACL(@eaDir)"));
}

TEST_F(EaMkdirTest, TheResultOfTheAclIsNotLookedAt) {
    Platform().acl = [](const std::string&) {
        errno = EPERM;
        return -1;
    };
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(0777, ModeOf(folder_));
    ExpectNothingReported();
}

TEST_F(EaMkdirTest, TheAclComesAfterModeAndFinderInfo) {
    Platform().fs_type = [](const std::string&, int) { return 7; };
    std::string at_acl;
    Platform().acl = [&](const std::string& path) {
        at_acl = std::to_string(attributes_.size()) + " " + std::to_string(ModeOf(path) == 0777);
        return 0;
    };
    const Umask umask(022);
    EXPECT_EQ(0, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_EQ("1 1", at_acl);
}

// ---- What exists ----------------------------------------------------------------------------

// Promise: "MAVOEAMKDir: A directory that exists"
TEST_F(EaMkdirTest, ADirectoryThatExistsKeepsItsModeAndGetsNoAcl) {
    ASSERT_EQ(0, ::mkdir(ea_dir_.c_str(), 0700));
    Platform().fs_type = [](const std::string&, int) { return 7; };
    TakeCallNames();
    EXPECT_EQ(0, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_EQ(0700, ModeOf(ea_dir_));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_THAT(attributes_, IsEmpty());
    EXPECT_THAT(TakeCallNames(),
                AllOf(Not(Contains("chmod")), Not(Contains("fchmod")), Not(Contains("setxattr"))));
    ExpectNothingReported();
}

TEST_F(EaMkdirTest, AParentThatExistsKeepsItsModeWhileTheDirectoryInItIsMade) {
    ASSERT_EQ(0, ::mkdir(ea_dir_.c_str(), 0700));
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(0700, ModeOf(ea_dir_));
    EXPECT_EQ(0777, ModeOf(folder_));
    EXPECT_EQ(PlatformCallsFor(folder_), TakePlatformCalls());
}

// Promise: "MAVOEAMKDir: Returns 0 when it exists"
TEST_F(EaMkdirTest, WhateverHasTheNameCountsAsThere) {
    WriteFile(ea_dir_, Ascii("a file"));
    EXPECT_EQ(0, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_EQ(Ascii("a file"), ReadFile(ea_dir_));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

TEST_F(EaMkdirTest, ASymbolicLinkThatWasThereBeforeIsLeftAlone) {
    const std::string victim = MakeVictim();
    ASSERT_EQ(0, symlink(victim.c_str(), ea_dir_.c_str()));
    EXPECT_EQ(0, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_EQ(0700, ModeOf(victim));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

// Promise: "MAVOEAMKDir: Returns 0 when it exists"
TEST_F(EaMkdirTest, LosingTheRaceWithAnotherProcessIsSuccess) {
    Hooks().mkdir = [](const char* path, mode_t mode) {
        EXPECT_EQ(0, ::mkdir(path, 0700));  // the other process is first
        return ::mkdir(path, mode);
    };
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(0700, ModeOf(ea_dir_));
    EXPECT_EQ(0700, ModeOf(folder_));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

// ---- Arguments ------------------------------------------------------------------------------

// Promise: "MAVOEAMKDir: Codes: 0xD00"
TEST_F(EaMkdirTest, ANullPathIsLoggedAndRecorded) {
    BeUser(kUser);
    for (const int parent_first : {0, 1}) {
        EXPECT_EQ(-1, MAVOEAMKDir(parent_first, nullptr));
        EXPECT_THAT(
            TakeLog(),
            ElementsAre("ea_mkdir.c:LINE Invaild Argument (((void *)0) != szEADirPath)=[0]"));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, kUnit)));
    }
    EXPECT_THAT(TakeCallNames(), Not(Contains("seteuid")));
}

// Promise: "MAVOEAMKDir: Codes: 0xD00"
TEST_F(EaMkdirTest, ParentFirstWithoutASlashFailsAndMakesNothing) {
    char before[4096];
    ASSERT_NE(nullptr, getcwd(before, sizeof before));
    ASSERT_EQ(0, chdir(dir_.path().c_str()));
    BeUser(kUser);
    EXPECT_EQ(-1, MAVOEAMKDir(1, "@eaDir"));
    ASSERT_EQ(0, chdir(before));
    ExpectOnly(0xD00);
    EXPECT_THAT(NamesIn(dir_.path()), IsEmpty());
    EXPECT_THAT(TakeCallNames(), Not(Contains("mkdir")));
    EXPECT_EQ(kUser, uid_);
}

TEST_F(EaMkdirTest, AnEmptyPathFailsAsTheKernelFailsIt) {
    errno = 0;
    EXPECT_EQ(-1, MAVOEAMKDir(0, ""));
    EXPECT_EQ(ENOENT, errno);
    ExpectOnly(0x3C00);
    EXPECT_EQ(-1, MAVOEAMKDir(1, ""));
    ExpectOnly(0xD00);
}

TEST_F(EaMkdirTest, TheParentOfANameInTheRootIsTheEmptyPath) {
    Hooks().mkdir = [](const char* path, mode_t mode) {
        EXPECT_STREQ("", path);
        return ::mkdir("", mode);
    };
    errno = 0;
    EXPECT_EQ(-1, MAVOEAMKDir(1, "/mavoea-test-never-made"));
    EXPECT_EQ(ENOENT, errno);
    ExpectOnly(0x3C00);
}

// ---- Finder info ----------------------------------------------------------------------------

// Promise: "MAVOEAMKDir: Creates the EA directory"
TEST_F(EaMkdirTest, OnAttributeVolumesTheFinderInfoHidesTheDirectory) {
    Platform().fs_type = [](const std::string&, int flag) {
        EXPECT_EQ(0, flag);
        return 7;
    };
    TakeCalls();
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    const Bytes hidden = Hex("00*8 40 00*23");
    EXPECT_EQ((std::map<std::string, Bytes>{{ea_dir_ + " com.apple.FinderInfo", hidden},
                                            {folder_ + " com.apple.FinderInfo", hidden}}),
              attributes_);
    EXPECT_THAT(TakeCalls(),
                AllOf(Contains("setxattr(" + ea_dir_ + ", com.apple.FinderInfo, 32, 0)"),
                      Contains("setxattr(" + folder_ + ", com.apple.FinderInfo, 32, 0)")));
    EXPECT_THAT(TakePlatformCalls(), Contains("MAVOACLSetEADirACL(" + folder_ + ")"));
    ExpectNothingReported();
}

TEST_F(EaMkdirTest, OtherVolumesGetNoFinderInfo) {
    for (const int type : {-1, 0, 1, 2, 3, 4, 5, 6, 8, 10, 12}) {
        SCOPED_TRACE(type);
        Platform().fs_type = [type](const std::string&, int) { return type; };
        const TempDir parent;
        const std::string path = parent / "@eaDir";
        EXPECT_EQ(0, MAVOEAMKDir(0, path.c_str()));
        EXPECT_EQ(PlatformCallsFor(path), TakePlatformCalls());
    }
    EXPECT_THAT(attributes_, IsEmpty());
    EXPECT_THAT(TakeCallNames(), Not(Contains("setxattr")));
    ExpectNothingReported();
}

// Promise: "MAVOEAMKDir: 0x2A00"
TEST_F(EaMkdirTest, AFinderInfoThatCannotBeSetFailsAndLeavesTheDirectoryWithoutAcl) {
    Platform().fs_type = [](const std::string&, int) { return 7; };
    BeUser(kUser);
    const FailCall fault("setxattr", ENOTSUP);
    EXPECT_EQ(-1, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_EQ(ENOTSUP, errno);
    ExpectOnly(0x2A00);
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(" + ea_dir_ + ", 0)"));
    EXPECT_EQ(kUser, uid_);
}

// ---- Failures -------------------------------------------------------------------------------

// Promise: "MAVOEAMKDir: 0x3C00"
TEST_F(EaMkdirTest, ADirectoryThatCannotBeMadeFailsWith0x3C00) {
    for (const int error : {EACCES, ENOSPC, EROFS, ENAMETOOLONG}) {
        SCOPED_TRACE(strerror(error));
        BeUser(kUser);
        const FailCall fault("mkdir", error);
        EXPECT_EQ(-1, MAVOEAMKDir(0, ea_dir_.c_str()));
        EXPECT_EQ(error, errno);
        ExpectOnly(0x3C00);
        EXPECT_THAT(TakePlatformCalls(), IsEmpty());
        EXPECT_EQ(kUser, uid_);
    }
}

TEST_F(EaMkdirTest, WhenTheParentCannotBeMadeTheDirectoryIsNotTried) {
    TakeCallNames();
    const FailCall fault("mkdir", EROFS);
    EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(EROFS, errno);
    ExpectOnly(0x3C00);
    const auto names = TakeCallNames();
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "mkdir"));
}

// Promise: "MAVOEAMKDir: 0x2A00"
TEST_F(EaMkdirTest, AModeThatCannotBeSetFailsAndLeavesTheDirectory) {
    BeUser(kUser);
    const Umask umask(077);
    const FailCall fault("fchmod", EIO);
    EXPECT_EQ(-1, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ(EIO, errno);
    ExpectOnly(0x2A00);
    EXPECT_EQ(0700, ModeOf(ea_dir_));
    EXPECT_THAT(TakePlatformCalls(), Not(Contains(StartsWith("MAVOACLSetEADirACL"))));
    EXPECT_EQ(kUser, uid_);
}

// Promise: "MAVOEAMKDir: 0x2A00"
// Promise: "Last steps: (One that"
TEST_F(EaMkdirTest, ADirectoryThatCannotBeOpenedIsRemovedAgainAndMadeWholeTheNextTime) {
    const Umask umask(077);
    for (const int error : {EMFILE, ENFILE, ENOMEM}) {
        for (const int nth : {1, 2}) {  // the parent, the directory in it
            SCOPED_TRACE(testing::Message() << strerror(error) << " " << nth);
            BeUser(kUser);
            TakePlatformCalls();
            {
                const FailCall fault("open", error, nth);
                errno = 0;
                EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
                EXPECT_EQ(error, errno);
            }
            ExpectOnly(0x2A00);
            EXPECT_FALSE(Exists(folder_));
            EXPECT_EQ(nth == 2, Exists(ea_dir_));
            EXPECT_EQ(kUser, uid_);
            EXPECT_EQ(nth == 2 ? PlatformCallsFor(ea_dir_) : std::vector<std::string>(),
                      TakePlatformCalls());

            EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
            EXPECT_EQ(0777, ModeOf(ea_dir_));
            EXPECT_EQ(0777, ModeOf(folder_));
            EXPECT_THAT(TakePlatformCalls(), Contains("MAVOACLSetEADirACL(" + folder_ + ")"));
            ASSERT_EQ(0, rmdir(folder_.c_str()));
            ASSERT_EQ(0, rmdir(ea_dir_.c_str()));
        }
    }
}

// Promise: "MAVOEAMKDir: 0x2A00"
TEST_F(EaMkdirTest, ADirectoryThatCannotBeOpenedStaysWhenSomebodyHasUsedIt) {
    Hooks().before = [this](const std::string& name) {
        if (name == "open") WriteFile(ea_dir_ + "/theirs", Ascii("theirs"));
    };
    const FailCall fault("open", EMFILE);
    errno = 0;
    EXPECT_EQ(-1, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_EQ(EMFILE, errno);
    ExpectOnly(0x2A00);
    EXPECT_EQ(Ascii("theirs"), ReadFile(ea_dir_ + "/theirs"));
}

TEST_F(EaMkdirTest, WhenTheModeOfTheParentCannotBeSetTheDirectoryIsNotTried) {
    TakeCallNames();
    const FailCall fault("fchmod", EIO);
    EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
    ExpectOnly(0x2A00);
    EXPECT_TRUE(Exists(ea_dir_));
    EXPECT_FALSE(Exists(folder_));
}

// Promise: "MAVOEAMKDir: 0x100"
TEST_F(EaMkdirTest, LackOfMemoryForTheCopyOfThePathFailsWith0x100AndMakesNothing) {
    BeUser(kUser);
    const FailCall fault("malloc", ENOMEM);
    EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_TRUE(fault.fired());
    ExpectOnly(0x100);
    EXPECT_THAT(NamesIn(dir_.path()), IsEmpty());
    EXPECT_EQ(kUser, uid_);
}

// Promise: "mavoea.h: Results."
TEST_F(EaMkdirTest, EveryFailingCallIsRecordedOnceAndRestoresTheUser) {
    Platform().fs_type = [](const std::string&, int) { return 7; };
    std::map<std::string, int> seen;
    for (int nth = 1;; ++nth) {
        ASSERT_LT(nth, 100);
        const TempDir parent;
        const std::string path = parent / "@eaDir" + "/name";
        BeUser(kUser);
        TakePlatformCalls();
        errno = 0;
        const FailNthCall fault(nth, EIO);
        const int result = MAVOEAMKDir(1, path.c_str());
        const int error = errno;
        if (!fault.fired()) {
            EXPECT_EQ(0, result);
            EXPECT_EQ(kUser, uid_);
            // Of both directories mkdir, open, fchmod and setxattr; seteuid twice; the copy.
            EXPECT_GE(nth, 12);
            return;
        }
        const std::string call = fault.name() + " " + std::to_string(++seen[fault.name()]);
        SCOPED_TRACE(call);
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        if (call == "seteuid 2") {  // back again: not looked at
            EXPECT_EQ(0, result);
            ExpectNothingReported();
            continue;
        }
        EXPECT_EQ(kUser, uid_);
        EXPECT_EQ(-1, result);
        EXPECT_EQ(EIO, error);
        const std::map<std::string, int> codes = {
            {"seteuid", 0x3C00}, {"mkdir", 0x3C00},  {"malloc", 0x100},
            {"open", 0x2A00},    {"fchmod", 0x2A00}, {"fstat", 0x2A00},
            {"stat", 0x2A00},    {"lstat", 0x2A00},  {"setxattr", 0x2A00}};
        ASSERT_TRUE(codes.contains(fault.name())) << "a call that was not expected";
        ExpectOnly(codes.at(fault.name()));
        EXPECT_THAT(TakePlatformCalls(), Not(Contains("MAVOACLSetEADirACL(" + path + ")")));
    }
}

// ---- The user -------------------------------------------------------------------------------

TEST_F(EaMkdirTest, AsTheSuperuserNoSeteuidIsCalledAtAll) {
    BeUser(0);
    TakeCallNames();
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(-1, MAVOEAMKDir(0, (dir_ / "none/@eaDir").c_str()));
    EXPECT_THAT(TakeCallNames(), Not(Contains("seteuid")));
}

// Promise: "mavoea.h: The other functions share process-wide state"
// Promise: "MAVOEAMKDir: The effective uid is changed"
TEST_F(EaMkdirTest, AnotherUserIsTheSuperuserFromBeforeTheFirstDirectoryUntilAfterTheLast) {
    BeUser(kUser);
    Platform().acl = [this](const std::string&) {
        EXPECT_EQ(0u, uid_);
        return 0;
    };
    TakeCalls();
    EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_EQ(kUser, uid_);
    std::vector<std::string> calls = TakeCalls();
    std::erase_if(calls, [](const std::string& call) {
        return !call.starts_with("seteuid(") && !call.starts_with("mkdir(");
    });
    EXPECT_THAT(calls, ElementsAre("seteuid(0)", "mkdir(" + ea_dir_ + ", 0777)",
                                   "mkdir(" + folder_ + ", 0777)", "seteuid(1000)"));
}

// Promise: "MAVOEAMKDir: 0x3C00"
TEST_F(EaMkdirTest, AFailedSwitchToTheSuperuserFailsWith0x3C00AndMakesNothing) {
    BeUser(kUser);
    TakeCallNames();
    const FailCall fault("seteuid", EPERM);
    EXPECT_EQ(-1, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_EQ(EPERM, errno);
    ExpectOnly(0x3C00);
    EXPECT_FALSE(Exists(ea_dir_));
    const auto names = TakeCallNames();
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "seteuid"));
    EXPECT_THAT(names, Not(Contains("mkdir")));
}

TEST_F(EaMkdirTest, AFailedSwitchBackIsNotLookedAt) {
    BeUser(kUser);
    const FailCall fault("seteuid", EAGAIN, 2);
    EXPECT_EQ(0, MAVOEAMKDir(0, ea_dir_.c_str()));
    EXPECT_TRUE(fault.fired());
    EXPECT_TRUE(Exists(ea_dir_));
    ExpectNothingReported();
}

// Promise: "MAVOEAMKDir: Creates the EA directory"
TEST_F(EaMkdirTest, AProcessWithASavedUidOf0MakesThemAsTheSuperuserAndComesBack) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    ASSERT_EQ(0, ::chmod(dir_.path().c_str(), 0755));  // the user may not write here
    AsUser(kUser, Root::kSaved, [this] {
        const Umask umask(0777);
        EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
        EXPECT_EQ(kUser, ::geteuid());
        EXPECT_EQ(0, MAVOEAMKDir(1, folder_.c_str()));
        EXPECT_EQ(kUser, ::geteuid());
        EXPECT_EQ(-1, MAVOEAMKDir(0, (dir_ / "none/@eaDir").c_str()));
        EXPECT_EQ(ENOENT, errno);
        EXPECT_EQ(kUser, ::geteuid());
        ExpectOnly(0x3C00);
    });
    for (const std::string& path : {ea_dir_, folder_}) {
        struct stat info;
        ASSERT_EQ(0, lstat(path.c_str(), &info));
        EXPECT_EQ(0u, info.st_uid);
        EXPECT_EQ(0777, ModeOf(path));
    }
}

TEST_F(EaMkdirTest, AProcessThatCannotBecomeTheSuperuserMakesNothing) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    AsUser(65534, Root::kGivenUp, [this] {
        EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
        EXPECT_EQ(EPERM, errno);
        ExpectOnly(0x3C00);
        EXPECT_EQ(65534u, ::geteuid());
    });
    EXPECT_THAT(NamesIn(dir_.path()), IsEmpty());  // though the user may write here
}

// ---- Symbolic links put in the way ----------------------------------------------------------

// The parameter is the volume's type: 7 adds the Finder info.
class EaMkdirSwapTest : public EaMkdirTest, public ::testing::WithParamInterface<int> {
 protected:
    void SetUp() override {
        EaMkdirTest::SetUp();
        BeUser(kUser);
        Platform().fs_type = [](const std::string&, int) { return GetParam(); };
        TakeCallNames();
    }

    void ExpectFailedAndUntouched(const std::string& victim) {
        ExpectOnly(0x2A00);
        EXPECT_EQ(0700, ModeOf(victim));
        EXPECT_THAT(NamesIn(victim), IsEmpty());
        EXPECT_EQ(kUser, uid_);
    }
};

INSTANTIATE_TEST_SUITE_P(OnVolumesOfType, EaMkdirSwapTest, ::testing::Values(1, 7),
                         ::testing::PrintToStringParamName());

TEST_P(EaMkdirSwapTest, NothingIsChangedThroughALinkThatReplacedTheNewDirectory) {
    const std::string victim = MakeVictim();
    Hooks().mkdir = [&](const char* path, mode_t mode) {
        const int result = ::mkdir(path, mode);
        SwapForLink(path, victim);
        return result;
    };
    EXPECT_EQ(-1, MAVOEAMKDir(0, ea_dir_.c_str()));
    ExpectFailedAndUntouched(victim);
    EXPECT_THAT(TakePlatformCalls(), Not(Contains(StartsWith("MAVOACLSetEADirACL"))));
    EXPECT_THAT(TakeCallNames(), Not(Contains("setxattr")));
}

TEST_P(EaMkdirSwapTest, NothingIsChangedThroughALinkThatReplacedTheDirectoryOnceItsModeWasSet) {
    const std::string victim = MakeVictim();
    Platform().fs_type = [&](const std::string& path, int) {
        SwapForLink(path, victim);
        return GetParam();
    };
    EXPECT_EQ(-1, MAVOEAMKDir(0, ea_dir_.c_str()));
    ExpectFailedAndUntouched(victim);
    EXPECT_THAT(TakePlatformCalls(), Not(Contains(StartsWith("MAVOACLSetEADirACL"))));
    EXPECT_THAT(TakeCallNames(), Not(Contains("setxattr")));
}

TEST_P(EaMkdirSwapTest, NothingIsMadeThroughALinkThatReplacedTheNewParent) {
    const std::string victim = MakeVictim();
    Hooks().mkdir = [&](const char* path, mode_t mode) {
        const int result = ::mkdir(path, mode);
        if (path == ea_dir_) SwapForLink(path, victim);
        return result;
    };
    EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
    ExpectFailedAndUntouched(victim);
    EXPECT_THAT(TakePlatformCalls(), Not(Contains(StartsWith("MAVOACLSetEADirACL"))));
    EXPECT_THAT(TakeCallNames(), Not(Contains("setxattr")));
}

TEST_P(EaMkdirSwapTest, NothingIsMadeThroughALinkThatReplacedTheParentOnceItsModeWasSet) {
    const std::string victim = MakeVictim();
    Platform().fs_type = [&](const std::string& path, int) {
        if (path == ea_dir_) SwapForLink(path, victim);
        return GetParam();
    };
    EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
    ExpectFailedAndUntouched(victim);
    EXPECT_THAT(TakePlatformCalls(), Not(Contains(StartsWith("MAVOACLSetEADirACL"))));
    EXPECT_THAT(TakeCallNames(), Not(Contains("setxattr")));
}

TEST_P(EaMkdirSwapTest, NothingIsMadeThroughALinkThatReplacedTheParentOnceItWasComplete) {
    const std::string victim = MakeVictim();
    Platform().acl = [&](const std::string& path) {
        if (path == ea_dir_) SwapForLink(path, victim);
        return 0;
    };
    EXPECT_EQ(-1, MAVOEAMKDir(1, folder_.c_str()));
    EXPECT_THAT(NamesIn(victim), IsEmpty());
    EXPECT_EQ(0700, ModeOf(victim));
    EXPECT_EQ(1u, TakeRecords().size());
    EXPECT_EQ(kUser, uid_);
    EXPECT_THAT(TakePlatformCalls(), Not(Contains("MAVOACLSetEADirACL(" + folder_ + ")")));
}

}  // namespace
}  // namespace mavoea::test

// The resource fork as the attribute "com.apple.ResourceFork": the file "rsrc" beneath the object.
//
// No filesystem here offers that view, so "<object>/rsrc" stands for a file elsewhere.

#include <errno.h>
#include <limits.h>
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
using ::testing::EndsWith;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;

constexpr char kFork[] = "com.apple.ResourceFork";
constexpr uid_t kUser = 1000;

class ResourceForkTestBase : protected Identity {
 protected:
    ResourceForkTestBase() {
        ResetKernel();
        ResetPlatform();
        WriteFile(object_, Ascii("data fork"));
        SetMode(0744);
        SetFork("fork");
        OfferFork();
        Hooks().sync = [] {};  // The machine need not be synced for real.
        BeUser(0);
        live_blocks_ = TakeAllocations().live;
        descriptors_ = OpenDescriptors();
    }

    ~ResourceForkTestBase() {
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        ResetKernel();
        ResetPlatform();
    }

    void OfferFork() {
        Hooks().stat = [this](const char* path, struct stat* info) {
            return ::stat(IsView(path) ? fork_.c_str() : path, info);
        };
        Hooks().fopen = [this](const char* path, const char* mode) {
            EXPECT_TRUE(IsView(path)) << path;
            mode_while_open_ = ModeOf(object_);
            uid_while_open_ = uid_;
            return ::fopen(fork_.c_str(), mode);
        };
    }

    bool IsView(const std::string& path) const { return path == view_ || path == link_ + "/rsrc"; }

    void SetMode(mode_t mode) const { ASSERT_EQ(0, ::chmod(object_.c_str(), mode)); }
    void SetFork(const std::string& content) const { WriteFile(fork_, Ascii(content)); }
    std::string Fork() const {
        const Bytes bytes = ReadFile(fork_);
        return std::string(bytes.begin(), bytes.end());
    }

    TempDir dir_;
    const std::string object_ = dir_ / "object";
    const std::string view_ = object_ + "/rsrc";
    const std::string fork_ = dir_ / "fork";
    const std::string link_ = dir_ / "link";
    uid_t uid_while_open_ = 0;
    int mode_while_open_ = -1;
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// ---- What the three operations share --------------------------------------------------------

enum class Operation { kGet, kSet, kRemove };

class ResourceForkOperationTest : public ResourceForkTestBase,
                                  public ::testing::TestWithParam<Operation> {
 protected:
    static Operation operation() { return GetParam(); }

    static std::string unit() {
        switch (operation()) {
            case Operation::kGet:
                return "ea_xattr_get";
            case Operation::kSet:
                return "ea_xattr_set";
            case Operation::kRemove:
                return "ea_xattr_remove";
        }
        return "";
    }

    // Runs the operation; it succeeds on a fork that holds "fork".
    static int Run(const std::string& path) {
        char value[64];
        switch (operation()) {
            case Operation::kGet:
                return MAVOEAXattrGet(path.c_str(), kFork, value, sizeof value);
            case Operation::kSet:
                return MAVOEAXattrSet(path.c_str(), kFork, "new", 3, 0);
            case Operation::kRemove:
                return MAVOEAXattrRemove(path.c_str(), kFork);
        }
        return -2;
    }
    int Run() const { return Run(object_); }

    static int Success() { return operation() == Operation::kGet ? 4 : 0; }

    static std::string Line(const std::string& text) { return unit() + ":LINE " + text; }
    static std::string Line(const std::string& text, int error) {
        return Line(text + " " + strerror(error));
    }

    static std::vector<std::string> Only(const std::vector<std::string>& calls,
                                         const std::vector<std::string>& names) {
        std::vector<std::string> kept;
        for (const std::string& call : calls) {
            const std::string name = call.substr(0, call.find('('));
            if (std::find(names.begin(), names.end(), name) != names.end()) kept.push_back(call);
        }
        return kept;
    }
};

INSTANTIATE_TEST_SUITE_P(Every, ResourceForkOperationTest,
                         ::testing::Values(Operation::kGet, Operation::kSet, Operation::kRemove),
                         [](const auto& operation) -> std::string {
                             switch (operation.param) {
                                 case Operation::kGet:
                                     return "Get";
                                 case Operation::kSet:
                                     return "Set";
                                 default:
                                     return "Remove";
                             }
                         });

TEST_P(ResourceForkOperationTest, SucceedsAndReportsNothing) {
    EXPECT_EQ(Success(), Run());
    ExpectNothingReported();
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

TEST_P(ResourceForkOperationTest, NeverUsesTheAttributeCalls) {
    TakeCallNames();
    Run();
    SetFork("");
    Run();
    EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("getxattr")), Not(Contains("setxattr")),
                                       Not(Contains("removexattr")), Not(Contains("listxattr"))));
}

// Promise: "Named attributes: "com.apple.ResourceFork" is"
TEST_P(ResourceForkOperationTest, LooksAtTheObjectThenAtItsFork) {
    TakeCalls();
    Run();
    EXPECT_THAT(Only(TakeCalls(), {"stat"}),
                ElementsAre("stat(" + object_ + ")", "stat(" + view_ + ")"));
}

// Promise: "MAVOEAXattrSet: for the fork"
// Promise: "MAVOEAXattrRemove: for the fork"
// Promise: "MAVOEAXattrGet: for the fork also 0x700"
TEST_P(ResourceForkOperationTest, ADirectoryFailsWith0x700AndIsLeftAlone) {
    const std::string directory = dir_ / "directory";
    ASSERT_EQ(0, mkdir(directory.c_str(), 0600));
    ASSERT_EQ(0, chmod(directory.c_str(), 0600));
    BeUser(kUser);
    TakeCallNames();
    EXPECT_EQ(-1, Run(directory));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x700, unit())));
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_EQ(0600, ModeOf(directory));
    EXPECT_THAT(TakeCallNames(),
                AllOf(Not(Contains("chmod")), Not(Contains("seteuid")), Not(Contains("fopen"))));
}

TEST_P(ResourceForkOperationTest, AFileThatItsOwnerCanExecuteKeepsItsModeAndTheProcessItsUser) {
    SetMode(0700);
    BeUser(kUser);
    TakeCallNames();
    EXPECT_EQ(Success(), Run());
    EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("chmod")), Not(Contains("seteuid"))));
    EXPECT_EQ(0700, mode_while_open_);
    EXPECT_EQ(kUser, uid_while_open_);
    ExpectNothingReported();
}

// Promise: "Named attributes: While a fork is used"
TEST_P(ResourceForkOperationTest, AFileWithoutTheBitHasItAsTheSuperuserWhileTheForkIsUsed) {
    SetMode(0644);
    BeUser(kUser);
    TakeCalls();
    EXPECT_EQ(Success(), Run());
    EXPECT_EQ(0744, mode_while_open_);
    EXPECT_EQ(0u, uid_while_open_);
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
    EXPECT_THAT(Only(TakeCalls(), {"stat", "seteuid", "chmod", "fopen"}),
                ElementsAre("stat(" + object_ + ")", "seteuid(0)", "chmod(" + object_ + ", 0744)",
                            "stat(" + view_ + ")", StartsWith("fopen(" + view_ + ", "),
                            "chmod(" + object_ + ", 0644)", "seteuid(1000)"));
    ExpectNothingReported();
}

TEST_P(ResourceForkOperationTest, TheSuperuserDoesNotSwitch) {
    SetMode(0644);
    BeUser(0);
    TakeCallNames();
    EXPECT_EQ(Success(), Run());
    EXPECT_THAT(TakeCallNames(), Not(Contains("seteuid")));
    EXPECT_EQ(0744, mode_while_open_);
    EXPECT_EQ(0644, ModeOf(object_));
    ExpectNothingReported();
}

TEST_P(ResourceForkOperationTest, OnlyTheOwnersExecuteBitCountsAndOtherBitsStay) {
    for (const int mode : {0, 0400, 0655, 04644, 02644, 01666, 07677}) {
        SCOPED_TRACE(mode);
        SetFork("fork");
        SetMode(static_cast<mode_t>(mode));
        if (ModeOf(object_) != mode) continue;  // not every user may set every bit
        TakeCalls();
        EXPECT_EQ(Success(), Run());
        EXPECT_EQ(mode | 0100, mode_while_open_);
        EXPECT_EQ(mode, ModeOf(object_));
        EXPECT_EQ(2u, Only(TakeCalls(), {"chmod"}).size());
    }
    ExpectNothingReported();
}

TEST_P(ResourceForkOperationTest, TheFileBehindASymbolicLinkIsUsed) {
    ASSERT_EQ(0, symlink(object_.c_str(), link_.c_str()));
    SetMode(0644);
    EXPECT_EQ(Success(), Run(link_));
    EXPECT_EQ(0744, mode_while_open_);
    EXPECT_EQ(0644, ModeOf(object_));
    ExpectNothingReported();
}

TEST_P(ResourceForkOperationTest, AFailedSwitchToTheSuperuserIsOnlyLogged) {
    SetMode(0644);
    BeUser(kUser);
    TakeCallNames();
    const FailCall fault("seteuid", EPERM);
    EXPECT_EQ(Success(), Run());
    EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to seteuid(0).", EPERM)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0744, mode_while_open_);
    EXPECT_EQ(0644, ModeOf(object_));
    const auto names = TakeCallNames();
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "seteuid"));
}

TEST_P(ResourceForkOperationTest, AFailedChmodIsOnlyLoggedBothTimes) {
    SetMode(0644);
    BeUser(kUser);
    const FailCall fault("chmod", EROFS, 0);
    EXPECT_EQ(Success(), Run());
    EXPECT_THAT(TakeLog(),
                ElementsAre(Line("Fail to chmod.", EROFS), Line("Fail to chmod.", EROFS)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    // The line tells which of the two it was.
    const std::vector<int> lines = TakeLogLines();
    ASSERT_EQ(2u, lines.size());
    EXPECT_LT(0, lines[0]);
    EXPECT_LT(lines[0], lines[1]);
    EXPECT_EQ(kUser, uid_);
}

TEST_P(ResourceForkOperationTest, AFailedChmodBackIsOnlyLogged) {
    SetMode(0644);
    BeUser(kUser);
    const FailCall fault("chmod", EIO, 2);
    EXPECT_EQ(Success(), Run());
    EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to chmod.", EIO)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(kUser, uid_);
}

TEST_P(ResourceForkOperationTest, AFailedSwitchBackIsOnlyLogged) {
    SetMode(0644);
    BeUser(kUser);
    const FailCall fault("seteuid", EAGAIN, 2);
    EXPECT_EQ(Success(), Run());
    EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to seteuid() back.", EAGAIN)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
}

TEST_P(ResourceForkOperationTest, TheCauseOfAFailureOutlivesARestoreThatFailsToo) {
    SetMode(0644);
    BeUser(kUser);
    Hooks().seteuid = [this](uid_t to) {
        if (to != 0) {
            errno = EAGAIN;
            return -1;
        }
        uid_ = to;
        return 0;
    };
    int chmods = 0;
    Hooks().chmod = [&chmods](const char* path, mode_t mode) {
        if (++chmods == 2) {
            errno = EROFS;
            return -1;
        }
        return ::chmod(path, mode);
    };
    Hooks().fopen = [](const char*, const char*) -> FILE* {
        errno = EMFILE;
        return nullptr;
    };
    EXPECT_EQ(-1, Run());
    EXPECT_EQ(EMFILE, errno);
    EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to open(" + view_ + ").", EMFILE),
                                       Line("Fail to chmod.", EROFS),
                                       Line("Fail to seteuid() back.", EAGAIN)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "Named attributes: so do those of a fork"
TEST_P(ResourceForkOperationTest, AForkThatCannotBeLookedAtIsLogged) {
    SetMode(0644);
    BeUser(kUser);
    TakeCallNames();
    const FailCall fault("stat", EACCES, 2);
    EXPECT_EQ(-1, Run());
    EXPECT_EQ(EACCES, errno);
    EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to stat(" + view_ + ").", EACCES)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
    EXPECT_THAT(TakeCallNames(), Not(Contains("fopen")));
}

// Promise: "Named attributes: "com.apple.ResourceFork" is"
TEST_P(ResourceForkOperationTest, AFilesystemWithoutTheViewFailsAsAFailedStat) {
    Hooks().stat = nullptr;
    Hooks().fopen = nullptr;
    SetMode(0644);
    EXPECT_EQ(-1, Run());
    EXPECT_EQ(ENOTDIR, errno);
    EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to stat(" + view_ + ").", ENOTDIR)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(Ascii("data fork"), ReadFile(object_));
}

// Promise: "Named attributes: so do those of a fork"
TEST_P(ResourceForkOperationTest, AForkThatCannotBeOpenedIsLogged) {
    SetMode(0644);
    BeUser(kUser);
    TakeCallNames();
    const FailCall fault("fopen", EACCES);
    EXPECT_EQ(-1, Run());
    EXPECT_EQ(EACCES, errno);
    EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to open(" + view_ + ").", EACCES)));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ("fork", Fork());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
    EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("sync")), Not(Contains("fclose"))));
}

TEST_P(ResourceForkOperationTest, EveryFailingCallIsReportedAndRestoresModeAndUser) {
    BeUser(kUser);
    std::map<std::string, int> seen;
    for (int nth = 1;; ++nth) {
        ASSERT_LT(nth, 50);
        SetFork("fork");
        SetMode(0644);
        BeUser(kUser);
        TakeCallNames();
        errno = 0;
        const FailNthCall fault(nth, EIO);
        const int result = Run();
        const int error = errno;
        const auto names = TakeCallNames();
        if (!fault.fired()) {
            EXPECT_EQ(Success(), result);
            EXPECT_GE(nth, 8);  // two each of stat, seteuid and chmod, and fopen
            return;
        }
        const std::string call = fault.name() + " " + std::to_string(++seen[fault.name()]);
        SCOPED_TRACE(call);

        std::vector<std::string> log;
        std::vector<Record> records = TakeRecords();
        bool fails = true;
        if (call == "stat 1") {
            if (operation() == Operation::kGet) {
                EXPECT_THAT(records, ElementsAre(RecordOf(0x2700, unit())));
                records.clear();
            } else {
                log = {Line("Fail to stat(" + object_ + ").", EIO)};
            }
        } else if (call == "seteuid 1") {
            log = {Line("Fail to seteuid(0).", EIO)};
            fails = false;
        } else if (call == "chmod 1" || call == "chmod 2") {
            log = {Line("Fail to chmod.", EIO)};
            fails = false;
        } else if (call == "stat 2") {
            log = {Line("Fail to stat(" + view_ + ").", EIO)};
        } else if (call == "fopen 1") {
            log = {Line("Fail to open(" + view_ + ").", EIO)};
        } else if (call == "fread 1") {
            log = {Line("Fail to read(" + view_ + ").", EIO)};
        } else if (call == "fwrite 1") {
            log = {Line("Fail to write(" + view_ + ").", EIO)};
        } else if (call == "fclose 1") {
            fails = operation() == Operation::kSet;
            if (fails) log = {Line("Fail to write(" + view_ + ").", EIO)};
        } else if (call == "seteuid 2") {
            log = {Line("Fail to seteuid() back.", EIO)};
            fails = false;
        } else {
            ADD_FAILURE() << "a call that was not expected";
        }

        EXPECT_EQ(fails ? -1 : Success(), result);
        if (fails) {
            EXPECT_EQ(EIO, error);
            EXPECT_THAT(names, Not(Contains("sync")));
        }
        EXPECT_THAT(records, IsEmpty());
        EXPECT_EQ(log, TakeLog());
        EXPECT_EQ(call == "chmod 2" ? 0744 : 0644, ModeOf(object_));
        EXPECT_EQ(call == "seteuid 2" ? 0u : kUser, uid_);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
    }
}

// The path of the fork goes into a buffer of 4095 bytes, its NUL included.
class LongPath {
 public:
    explicit LongPath(size_t length, const std::string& fork)
        : path_("/" + std::string(length - 1, 'a')), fork_(fork) {
        Hooks().stat = [this](const char* path, struct stat* info) {
            if (path == path_ + "/rsrc") return ::stat(fork_.c_str(), info);
            EXPECT_EQ(path_, path);
            *info = {};
            info->st_mode = S_IFREG | mode_;
            return 0;
        };
        Hooks().chmod = [this](const char* path, mode_t mode) {
            EXPECT_EQ(path_, path);
            mode_ = mode;
            return 0;
        };
        Hooks().fopen = [this](const char* path, const char* mode) {
            EXPECT_EQ(path_ + "/rsrc", path);
            return ::fopen(fork_.c_str(), mode);
        };
    }

    const std::string& path() const { return path_; }
    mode_t mode() const { return mode_; }

 private:
    std::string path_;
    std::string fork_;
    mode_t mode_ = 0644;
};

TEST_P(ResourceForkOperationTest, ALongPathIsUsedWhileThatOfTheForkFits) {
    const LongPath object(4089, fork_);
    EXPECT_EQ(Success(), Run(object.path()));
    EXPECT_EQ(0644u, object.mode());
    ExpectNothingReported();
}

TEST_P(ResourceForkOperationTest, AForkWhosePathDoesNotFitFailsAsAFailedStat) {
    for (const size_t length : {4090u, 4094u, 4095u, 5000u}) {
        SCOPED_TRACE(length);
        const LongPath object(length, fork_);
        BeUser(kUser);
        TakeCallNames();
        errno = 0;
        EXPECT_EQ(-1, Run(object.path()));
        EXPECT_EQ(ENAMETOOLONG, errno);
        EXPECT_THAT(TakeLog(), ElementsAre(AllOf(StartsWith(Line("Fail to stat(/aaaa")),
                                                 EndsWith("). File name too long"))));
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_THAT(TakeCallNames(), Not(Contains("fopen")));
        EXPECT_EQ(0644u, object.mode());
        EXPECT_EQ(kUser, uid_);
        EXPECT_EQ("fork", Fork());
    }
}

// With the real identity: a process that can become the superuser does, and comes back.
TEST_P(ResourceForkOperationTest, AProcessWithASavedUidOf0BecomesTheSuperuserAndComesBack) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    SetMode(0640);
    ASSERT_EQ(0, chmod(fork_.c_str(), 0600));  // only root may use the fork
    AsUser(kUser, Root::kSaved, [this] {
        Hooks().fopen = [this](const char*, const char* mode) {
            EXPECT_EQ(0u, ::geteuid());
            EXPECT_EQ(0740, ModeOf(object_));
            return ::fopen(fork_.c_str(), mode);
        };
        EXPECT_EQ(Success(), Run());
        EXPECT_EQ(kUser, ::geteuid());
        EXPECT_EQ(0640, ModeOf(object_));
        ExpectNothingReported();

        const FailCall fault("stat", EIO, 2);
        EXPECT_EQ(-1, Run());
        EXPECT_EQ(kUser, ::geteuid());
        EXPECT_EQ(0640, ModeOf(object_));
    });
}

TEST_P(ResourceForkOperationTest, WithTheBitInPlaceTheForkIsUsedAsTheUserWhoCalls) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    ASSERT_EQ(0, chmod(fork_.c_str(), 0600));
    AsUser(kUser, Root::kSaved, [this] {
        EXPECT_EQ(-1, Run());
        EXPECT_EQ(EACCES, errno);
        EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to open(" + view_ + ").", EACCES)));
        EXPECT_EQ(kUser, ::geteuid());
    });
    EXPECT_EQ("fork", Fork());
}

TEST_P(ResourceForkOperationTest, AProcessThatCannotBecomeTheSuperuserLogsItAndGoesOn) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    SetMode(0644);
    ASSERT_EQ(0, chown(object_.c_str(), 65534, 65534));
    ASSERT_EQ(0, chown(fork_.c_str(), 65534, 65534));
    AsUser(65534, Root::kGivenUp, [this] {
        EXPECT_EQ(Success(), Run());
        EXPECT_EQ(65534u, ::geteuid());
        EXPECT_EQ(0744, mode_while_open_);
        EXPECT_EQ(0644, ModeOf(object_));
        EXPECT_THAT(TakeLog(), ElementsAre(Line("Fail to seteuid(0).", EPERM)));
        EXPECT_THAT(TakeRecords(), IsEmpty());
    });
}

TEST_P(ResourceForkOperationTest, AFileOfSomebodyElseKeepsItsModeAndItsForkIsTriedAllTheSame) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    SetMode(0644);
    ASSERT_EQ(0, chmod(fork_.c_str(), 0666));
    AsUser(65534, Root::kGivenUp, [this] {
        EXPECT_EQ(Success(), Run());
        EXPECT_EQ(0644, mode_while_open_);
        EXPECT_THAT(TakeLog(),
                    ElementsAre(Line("Fail to seteuid(0).", EPERM), Line("Fail to chmod.", EPERM),
                                Line("Fail to chmod.", EPERM)));
        EXPECT_THAT(TakeRecords(), IsEmpty());
    });
    EXPECT_EQ(0644, ModeOf(object_));
}

// ---- Get ------------------------------------------------------------------------------------

class ResourceForkGetTest : public ResourceForkTestBase, public ::testing::Test {};

TEST_F(ResourceForkGetTest, TheForkIsReadWhole) {
    using namespace std::string_literals;
    SetFork("a\0b\xFF!"s);
    char value[8];
    memset(value, '#', sizeof value);
    TakeCalls();
    EXPECT_EQ(5, MAVOEAXattrGet(object_.c_str(), kFork, value, 8));
    EXPECT_EQ("a\0b\xFF!###"s, std::string(value, 8));
    EXPECT_THAT(TakeCalls(), AllOf(Contains("fopen(" + view_ + ", rb)"), Contains("fread(5)"),
                                   Contains("fclose()"), Not(Contains("sync()"))));
    ExpectNothingReported();
}

TEST_F(ResourceForkGetTest, ALargeForkIsReadWhole) {
    Bytes content;
    for (unsigned i = 0; i < 300'001; ++i) content.push_back(static_cast<std::uint8_t>(i * 7 >> 3));
    WriteFile(fork_, content);
    Bytes value(content.size());
    EXPECT_EQ(300'001, MAVOEAXattrGet(object_.c_str(), kFork, value.data(), 300'001));
    EXPECT_EQ(content, value);
}

// Promise: "MAVOEAXattrGet: with cbValue 0"
TEST_F(ResourceForkGetTest, WithoutABufferTheSizeIsReturnedAndNothingOpened) {
    SetMode(0644);
    TakeCallNames();
    EXPECT_EQ(4, MAVOEAXattrGet(object_.c_str(), kFork, nullptr, 0));
    char untouched = '#';
    EXPECT_EQ(4, MAVOEAXattrGet(object_.c_str(), kFork, &untouched, 0));
    EXPECT_EQ('#', untouched);
    EXPECT_THAT(TakeCallNames(), Not(Contains("fopen")));
    EXPECT_EQ(0644, ModeOf(object_));
    ExpectNothingReported();
}

TEST_F(ResourceForkGetTest, ABufferOfExactlyTheForksSizeIsEnough) {
    char value[4];
    EXPECT_EQ(4, MAVOEAXattrGet(object_.c_str(), kFork, value, 4));
    EXPECT_EQ("fork", std::string(value, 4));
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrGet: 0xBF00"
TEST_F(ResourceForkGetTest, ABufferOneByteTooSmallFailsWith0xBF00AndErange) {
    SetMode(0644);
    BeUser(kUser);
    char value[3] = {'#', '#', '#'};
    TakeCallNames();
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, value, 3));
    EXPECT_EQ(ERANGE, errno);
    EXPECT_EQ("###", std::string(value, 3));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xBF00, "ea_xattr_get")));
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
    EXPECT_THAT(TakeCallNames(), Not(Contains("fopen")));
}

// Promise: "Named attributes: an empty fork"
// Promise: "MAVOEAXattrGet: for the fork also 0x700"
TEST_F(ResourceForkGetTest, AnEmptyForkIsAbsentWith0x700AndEnodata) {
    SetFork("");
    SetMode(0644);
    BeUser(kUser);
    char value[8];
    for (const int size : {8, 1, 0}) {
        SCOPED_TRACE(size);
        errno = 0;
        EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, value, size));
        EXPECT_EQ(ENODATA, errno);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x700, "ea_xattr_get")));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_EQ(0644, ModeOf(object_));
        EXPECT_EQ(kUser, uid_);
    }
}

// Promise: "MAVOEAXattrGet: A missing fork"
TEST_F(ResourceForkGetTest, AMissingForkFailsSilentlyWithEnoent) {
    ASSERT_EQ(0, unlink(fork_.c_str()));
    SetMode(0644);
    BeUser(kUser);
    char value[8];
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, value, 8));
    EXPECT_EQ(ENOENT, errno);
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, nullptr, 0));
    EXPECT_EQ(ENOENT, errno);
    ExpectNothingReported();
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
}

TEST_F(ResourceForkGetTest, EnoentOfAMissingForkOutlivesARestoreThatFails) {
    ASSERT_EQ(0, unlink(fork_.c_str()));
    SetMode(0644);
    BeUser(kUser);
    const FailCall fault("seteuid", EAGAIN, 2);
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, nullptr, 0));
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ(ENOENT, errno);
}

// Promise: "MAVOEAXattrGet: for the fork also 0x700"
TEST_F(ResourceForkGetTest, AMissingObjectFailsWith0x700) {
    const std::string missing = dir_ / "missing";
    TakeCallNames();
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrGet(missing.c_str(), kFork, nullptr, 0));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x700, "ea_xattr_get")));
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("chmod")), Not(Contains("seteuid"))));
}

// Promise: "MAVOEAXattrGet: 0x2700"
TEST_F(ResourceForkGetTest, AnObjectThatCannotBeLookedAtFailsWith0x2700) {
    for (const int error : {EACCES, ENOTDIR, ELOOP, EIO, ENAMETOOLONG}) {
        SCOPED_TRACE(strerror(error));
        const FailCall fault("stat", error);
        EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, nullptr, 0));
        EXPECT_EQ(error, errno);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2700, "ea_xattr_get")));
        EXPECT_THAT(TakeLog(), IsEmpty());
    }
}

TEST_F(ResourceForkGetTest, AForkThatTurnsOutShorterThanItWasIsAFailedRead) {
    SetMode(0644);
    BeUser(kUser);
    const ShortCall fault("fread", 1, 3);
    char value[8];
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, value, 8));
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(TakeLog(),
                ElementsAre(StartsWith("ea_xattr_get:LINE Fail to read(" + view_ + "). ")));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
}

TEST_F(ResourceForkGetTest, NotMoreIsReadThanTheForkHeldWhenItWasLookedAt) {
    Hooks().fopen = [this](const char*, const char* mode) {
        SetFork("fork that grew");
        return ::fopen(fork_.c_str(), mode);
    };
    char value[16];
    memset(value, '#', sizeof value);
    EXPECT_EQ(4, MAVOEAXattrGet(object_.c_str(), kFork, value, 16));
    EXPECT_EQ("fork############", std::string(value, 16));
}

TEST_F(ResourceForkGetTest, ASizeThatIsMoreThanAnIntHoldsIsNeverReturnedWrapped) {
    for (const off_t size : {off_t{INT_MAX} + 1, off_t{1} << 32, (off_t{1} << 32) + 5}) {
        SCOPED_TRACE(size);
        Hooks().stat = [this, size](const char* path, struct stat* info) {
            const int result = ::stat(IsView(path) ? fork_.c_str() : path, info);
            if (IsView(path)) info->st_size = size;
            return result;
        };
        char value[8];
        TakeCallNames();
        EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, value, 8));
        EXPECT_EQ(ERANGE, errno);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xBF00, "ea_xattr_get")));
        EXPECT_THAT(TakeCallNames(), Not(Contains("fread")));
        EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), kFork, nullptr, 0));
        TakeRecords();
    }
}

// ---- Set ------------------------------------------------------------------------------------

class ResourceForkSetTest : public ResourceForkTestBase, public ::testing::Test {
 protected:
    int Set(const std::string& value, int flags = 0) const {
        return MAVOEAXattrSet(object_.c_str(), kFork, value.data(), static_cast<int>(value.size()),
                              flags);
    }
};

TEST_F(ResourceForkSetTest, TheForkIsReplacedWhole) {
    using namespace std::string_literals;
    SetFork("a longer fork");
    TakeCalls();
    EXPECT_EQ(0, Set("n\0\xFFw"s));
    EXPECT_EQ("n\0\xFFw"s, Fork());
    EXPECT_THAT(TakeCalls(), AllOf(Contains("fopen(" + view_ + ", w+b)"), Contains("fwrite(4)")));
    ExpectNothingReported();
}

TEST_F(ResourceForkSetTest, ALargeForkIsWrittenWhole) {
    std::string content;
    for (unsigned i = 0; i < 300'001; ++i) content.push_back(static_cast<char>(i * 7 >> 3 & 0x7F));
    EXPECT_EQ(0, Set(content));
    EXPECT_EQ(content, Fork());
}

TEST_F(ResourceForkSetTest, NoBytesEmptyTheFork) {
    EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), kFork, "ignored", 0, 0));
    EXPECT_EQ("", Fork());
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrSet: A fork is written"
TEST_F(ResourceForkSetTest, TheFilesystemsAreSyncedOnceTheBytesAreInTheKernel) {
    std::string at_sync = "(no sync)";
    Hooks().sync = [&] { at_sync = Fork(); };
    TakeCallNames();
    EXPECT_EQ(0, Set("new"));
    EXPECT_EQ("new", at_sync);
    const auto names = TakeCallNames();
    const auto close = std::find(names.begin(), names.end(), "fclose");
    const auto sync = std::find(names.begin(), names.end(), "sync");
    ASSERT_NE(names.end(), close);
    ASSERT_NE(names.end(), sync);
    EXPECT_LT(close, sync);
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "sync"));
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "fclose"));
}

TEST_F(ResourceForkSetTest, AnEmptyForkCanBeCreated) {
    SetFork("");
    EXPECT_EQ(0, Set("new", 1));
    EXPECT_EQ("new", Fork());
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrSet: for the fork"
TEST_F(ResourceForkSetTest, AnEmptyForkCannotBeReplaced) {
    for (const int flags : {2, 3}) {
        SCOPED_TRACE(flags);
        SetFork("");
        SetMode(0644);
        BeUser(kUser);
        TakeCallNames();
        errno = 0;
        EXPECT_EQ(-1, Set("new", flags));
        EXPECT_EQ(ENODATA, errno);
        EXPECT_EQ("", Fork());
        EXPECT_EQ(0644, ModeOf(object_));
        EXPECT_EQ(kUser, uid_);
        EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("fopen")), Not(Contains("sync"))));
    }
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrSet: for the fork"
TEST_F(ResourceForkSetTest, AForkThatHoldsBytesCannotBeCreated) {
    for (const int flags : {1, 3}) {
        SCOPED_TRACE(flags);
        SetMode(0644);
        BeUser(kUser);
        TakeCallNames();
        errno = 0;
        EXPECT_EQ(-1, Set("new", flags));
        EXPECT_EQ(EEXIST, errno);
        EXPECT_EQ("fork", Fork());
        EXPECT_EQ(0644, ModeOf(object_));
        EXPECT_EQ(kUser, uid_);
        EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("fopen")), Not(Contains("sync"))));
    }
    ExpectNothingReported();
}

TEST_F(ResourceForkSetTest, AForkThatHoldsBytesCanBeReplaced) {
    EXPECT_EQ(0, Set("new", 2));
    EXPECT_EQ("new", Fork());
    ExpectNothingReported();
}

TEST_F(ResourceForkSetTest, OtherFlagsChangeNothing) {
    EXPECT_EQ(0, Set("new", 4));
    EXPECT_EQ("new", Fork());
    SetFork("");
    EXPECT_EQ(0, Set("new", 4));
    EXPECT_EQ("new", Fork());
}

TEST_F(ResourceForkSetTest, AMissingForkIsLoggedAndNotMade) {
    ASSERT_EQ(0, unlink(fork_.c_str()));
    for (const int flags : {0, 1, 2}) {
        errno = 0;
        EXPECT_EQ(-1, Set("new", flags));
        EXPECT_EQ(ENOENT, errno);
        EXPECT_THAT(TakeLog(), ElementsAre("ea_xattr_set:LINE Fail to stat(" + view_ +
                                           "). No such file or directory"));
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_FALSE(Exists(fork_));
}

TEST_F(ResourceForkSetTest, AMissingObjectIsLogged) {
    const std::string missing = dir_ / "missing";
    EXPECT_EQ(-1, MAVOEAXattrSet(missing.c_str(), kFork, "new", 3, 0));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_THAT(TakeLog(), ElementsAre("ea_xattr_set:LINE Fail to stat(" + missing +
                                       "). No such file or directory"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(ResourceForkSetTest, AShortWriteIsLoggedOnceAndNotSynced) {
    SetMode(0644);
    BeUser(kUser);
    TakeCallNames();
    const ShortCall fault("fwrite", 1, 2);
    EXPECT_EQ(-1, Set("new"));
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(TakeLog(),
                ElementsAre(StartsWith("ea_xattr_set:LINE Fail to write(" + view_ + "). ")));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
    EXPECT_THAT(TakeCallNames(), AllOf(Contains("fclose"), Not(Contains("sync"))));
}

TEST_F(ResourceForkSetTest, AFailedCloseIsAFailedWrite) {
    SetMode(0644);
    BeUser(kUser);
    TakeCallNames();
    const FailCall fault("fclose", ENOSPC);
    EXPECT_EQ(-1, Set("new"));
    EXPECT_EQ(ENOSPC, errno);
    EXPECT_THAT(TakeLog(), ElementsAre("ea_xattr_set:LINE Fail to write(" + view_ +
                                       "). No space left on device"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
    const auto names = TakeCallNames();
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "fclose"));
    EXPECT_THAT(names, Not(Contains("sync")));
}

// A full device takes what stdio buffers and refuses it when the buffer is flushed.
TEST_F(ResourceForkSetTest, ADeviceThatRefusesTheBufferedBytesIsAFailedWrite) {
    if (!Exists("/dev/full")) GTEST_SKIP() << "there is no /dev/full";
    Hooks().fopen = [](const char*, const char*) { return ::fopen("/dev/full", "r+b"); };
    TakeCallNames();
    EXPECT_EQ(-1, Set("new"));
    EXPECT_EQ(ENOSPC, errno);
    EXPECT_THAT(TakeLog(), ElementsAre("ea_xattr_set:LINE Fail to write(" + view_ +
                                       "). No space left on device"));
    EXPECT_THAT(TakeCallNames(), Not(Contains("sync")));
}

// ---- Remove ---------------------------------------------------------------------------------

class ResourceForkRemoveTest : public ResourceForkTestBase, public ::testing::Test {
 protected:
    int Remove() const { return MAVOEAXattrRemove(object_.c_str(), kFork); }
};

// Promise: "MAVOEAXattrRemove: a fork is emptied"
TEST_F(ResourceForkRemoveTest, AnEmptyForkIsLeftAndNotAMissingOne) {
    TakeCalls();
    std::string at_sync = "(no sync)";
    Hooks().sync = [&] { at_sync = Fork(); };
    EXPECT_EQ(0, Remove());
    ASSERT_TRUE(Exists(fork_));
    EXPECT_EQ("", Fork());
    EXPECT_EQ("", at_sync);
    EXPECT_THAT(TakeCalls(), AllOf(Contains("fopen(" + view_ + ", w+b)"), Contains("sync()"),
                                   Contains("fclose()")));
    ExpectNothingReported();
}

TEST_F(ResourceForkRemoveTest, AForkThatIsEmptyAlreadyIsNotOpened) {
    SetFork("");
    SetMode(0644);
    BeUser(kUser);
    TakeCallNames();
    EXPECT_EQ(0, Remove());
    EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("fopen")), Not(Contains("sync"))));
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_EQ(kUser, uid_);
    ExpectNothingReported();
}

TEST_F(ResourceForkRemoveTest, AMissingForkIsLoggedAndNotMade) {
    ASSERT_EQ(0, unlink(fork_.c_str()));
    EXPECT_EQ(-1, Remove());
    EXPECT_EQ(ENOENT, errno);
    EXPECT_THAT(TakeLog(), ElementsAre("ea_xattr_remove:LINE Fail to stat(" + view_ +
                                       "). No such file or directory"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_FALSE(Exists(fork_));
}

TEST_F(ResourceForkRemoveTest, AMissingObjectIsLogged) {
    const std::string missing = dir_ / "missing";
    EXPECT_EQ(-1, MAVOEAXattrRemove(missing.c_str(), kFork));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_THAT(TakeLog(), ElementsAre("ea_xattr_remove:LINE Fail to stat(" + missing +
                                       "). No such file or directory"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

}  // namespace
}  // namespace mavoea::test

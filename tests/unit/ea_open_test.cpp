// Opening metadata files in both places, and the EA directory that comes with creating one.

#include <errno.h>
#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <signal.h>
#include <stddef.h>
#include <stdio.h>
#include <string.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <iterator>
#include <map>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/process.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

constexpr char kStream[] = "MavoEAStream";
constexpr char kResource[] = "MavoResource";
constexpr char kUnit[] = "ea_open";
constexpr uid_t kUser = 1000;

class EaOpenTest : public ::testing::Test, protected Identity {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        WriteFile(object_, Ascii("data"));
        BeUser(0);
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
    }

    // The open calls made for `path`, without the path: "O_RDWR|O_CREAT, 0777". All are made so
    // that neither a link is followed nor a pipe waited for, which is left out: one that is opened
    // to be read and written does not wait by itself.
    static std::vector<std::string> OpensOf(const std::string& path) {
        const std::string start = "open(" + path + ", ";
        std::vector<std::string> opens;
        for (const std::string& call : TakeCalls()) {
            if (call.starts_with(start)) {
                std::string open = call.substr(start.size(), call.size() - start.size() - 1);
                const bool waits = !open.starts_with("O_RDWR");
                for (const std::string guard : {"|O_NONBLOCK", "|O_NOFOLLOW"}) {
                    const std::size_t at = open.find(guard);
                    const bool wanted = waits || guard == "|O_NOFOLLOW";
                    EXPECT_EQ(wanted, at != std::string::npos) << call;
                    if (at != std::string::npos) open.erase(at, guard.size());
                }
                opens.push_back(open);
            }
        }
        return opens;
    }

    static void ExpectFailed(int error, int fd) {
        const int found = errno;
        EXPECT_EQ(-1, fd);
        EXPECT_EQ(error, found) << strerror(found);
        ExpectNothingReported();
    }

    void MakeEaDir() const { ASSERT_EQ(0, ::mkdir(ea_dir_.c_str(), 0777)); }

    TempDir dir_;
    const std::string object_ = dir_ / "a.txt";
    const std::string ea_dir_ = dir_ / "@eaDir";
    const std::string stream_ = ea_dir_ + "/a.txt@MavoEAStream";
    const std::string resource_ = ea_dir_ + "/a.txt@MavoResource";
    const std::string folder_ = ea_dir_ + "/a.txt";
    const std::string legacy_ = folder_ + "/MAVO:Resource";
    const std::string sidecar_ = dir_ / "._a.txt";
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// A descriptor that is closed at the end of its scope.
class Fd {
 public:
    explicit Fd(int fd) : fd_(fd) {}
    ~Fd() {
        if (fd_ >= 0) ::close(fd_);
    }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;

    bool ok() const { return fd_ >= 0; }
    int get() const { return fd_; }
    bool Write(const std::string& text) const {
        return ::write(fd_, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    }
    std::string Read() const {
        char text[64];
        const ssize_t size = ::read(fd_, text, sizeof text);
        return size < 0 ? "(not readable)" : std::string(text, static_cast<size_t>(size));
    }

 private:
    int fd_;
};

// ---- In the EA directory --------------------------------------------------------------------

// MAVOEAOpen() for place 0 and MAVOEAOpenNoADFS() are the same.
class EaOpenInEaDirTest : public EaOpenTest, public ::testing::WithParamInterface<bool> {
 protected:
    static int Open(int form, const char* path, const char* name, int oflag) {
        return GetParam() ? MAVOEAOpen(form, path, name, oflag, EA_PLACE_EADIR)
                          : MAVOEAOpenNoADFS(form, path, name, oflag);
    }
    int OpenStream(int oflag) const { return Open(1, object_.c_str(), kStream, oflag); }
};

INSTANTIATE_TEST_SUITE_P(With, EaOpenInEaDirTest, ::testing::Bool(), [](const auto& through) {
    return through.param ? "MAVOEAOpen" : "MAVOEAOpenNoADFS";
});

// Promise: "MAVOEAOpen: Opens the metadata file"
// Promise: "MAVOEAOpen: With O_CREAT the EA directory"
// Promise: "MAVOEAOpenNoADFS: MAVOEAOpen()"
// Promise: "Where metadata lies: `D/@eaDir/N@MavoEAStream`"
TEST_P(EaOpenInEaDirTest, CreatingMakesTheEaDirectoryAndAnEmptyFile) {
    TakeCalls();
    const Fd fd(OpenStream(O_RDWR | O_CREAT));
    ASSERT_TRUE(fd.ok());
    // Looked for first, so that whatever is there already is found before anything is created.
    EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDWR, 0777", "O_RDWR|O_CREAT, 0777"));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt@MavoEAStream"));
    EXPECT_EQ(Bytes(), ReadFile(stream_));
    EXPECT_THAT(TakePlatformCalls(), Contains("MAVOACLSetEADirACL(" + ea_dir_ + ")"));
    EXPECT_TRUE(fd.Write("stream"));
    EXPECT_EQ(Ascii("stream"), ReadFile(stream_));
    ExpectNothingReported();
}

// Promise: "MAVOEAOpen: Opens the metadata file"
TEST_P(EaOpenInEaDirTest, TheUmaskNarrowsTheFileButNotTheDirectory) {
    const Umask umask(027);
    const Fd fd(OpenStream(O_RDWR | O_CREAT));
    ASSERT_TRUE(fd.ok());
    EXPECT_EQ(0750, ModeOf(stream_));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
}

// Promise: "MAVOEAOpen: Opens the metadata file"
TEST_P(EaOpenInEaDirTest, AFileThatExistsIsOpenedWithoutCreating) {
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    TakeCalls();
    const Fd fd(OpenStream(O_RDWR | O_CREAT));
    ASSERT_TRUE(fd.ok());
    EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDWR, 0777"));
    EXPECT_EQ("stream", fd.Read());
    ExpectNothingReported();
}

// Promise: "MAVOEAOpen: What is there is opened"
// Promise: "MAVOEAOpen: only EA_FORM_FOLDER"
TEST_P(EaOpenInEaDirTest, OnlyTheFolderFormCreatesExclusively) {
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    const Fd fd(OpenStream(O_RDWR | O_CREAT | O_EXCL));
    ASSERT_TRUE(fd.ok());
    EXPECT_EQ("stream", fd.Read());

    const Fd made(Open(0, object_.c_str(), "MAVO:x", O_RDWR | O_CREAT | O_EXCL));
    ASSERT_TRUE(made.ok());
    ExpectFailed(EEXIST, Open(0, object_.c_str(), "MAVO:x", O_RDWR | O_CREAT | O_EXCL));
    ExpectNothingReported();
}

TEST_P(EaOpenInEaDirTest, AnEaDirectoryThatExistsKeepsItsMode) {
    ASSERT_EQ(0, ::mkdir(ea_dir_.c_str(), 0700));
    const Fd fd(OpenStream(O_RDWR | O_CREAT));
    EXPECT_TRUE(fd.ok());
    EXPECT_EQ(0700, ModeOf(ea_dir_));
    EXPECT_THAT(TakePlatformCalls(), Not(Contains("MAVOACLSetEADirACL(" + ea_dir_ + ")")));
}

TEST_P(EaOpenInEaDirTest, ReadOnlyIsReadOnly) {
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    TakeCalls();
    const Fd fd(OpenStream(0));
    ASSERT_TRUE(fd.ok());
    EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDONLY, 0777"));
    EXPECT_EQ("stream", fd.Read());
    EXPECT_FALSE(fd.Write("x"));
    ExpectNothingReported();
}

// Promise: "MAVOEAOpen: Opens the metadata file"
TEST_P(EaOpenInEaDirTest, TruncatingEmptiesAFileThatExists) {
    MakeEaDir();
    WriteFile(resource_, Ascii("resource"));
    TakeCalls();
    const Fd fd(Open(1, object_.c_str(), kResource, O_RDWR | O_CREAT | O_TRUNC));
    ASSERT_TRUE(fd.ok());
    EXPECT_THAT(OpensOf(resource_), ElementsAre("O_RDWR|O_TRUNC, 0777"));
    EXPECT_EQ(Bytes(), ReadFile(resource_));
    ExpectNothingReported();
}

TEST_P(EaOpenInEaDirTest, TruncatingCreatesAFileThatIsMissing) {
    TakeCalls();
    const Fd fd(Open(1, object_.c_str(), kResource, O_RDWR | O_CREAT | O_TRUNC));
    ASSERT_TRUE(fd.ok());
    EXPECT_THAT(OpensOf(resource_),
                ElementsAre("O_RDWR|O_TRUNC, 0777", "O_RDWR|O_CREAT|O_TRUNC, 0777"));
    EXPECT_EQ(Bytes(), ReadFile(resource_));
    ExpectNothingReported();
}

// Promise: "MAVOEAOpen: Returns a descriptor"
TEST_P(EaOpenInEaDirTest, AMissingFileFailsWithEnoentAndMakesNoEaDirectory) {
    for (const int oflag : {0, O_RDWR, O_RDWR | O_TRUNC}) {
        SCOPED_TRACE(oflag);
        TakeCalls();
        errno = 0;
        ExpectFailed(ENOENT, OpenStream(oflag));
        EXPECT_EQ(1u, OpensOf(stream_).size());
        EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("a.txt"));
    }
    ExpectFailed(ENOENT, Open(0, object_.c_str(), "MAVO:Resource", 0));
    ExpectFailed(ENOENT, Open(2, object_.c_str(), kStream, 0));
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("a.txt"));
    EXPECT_THAT(TakeCallNames(), Not(Contains("mkdir")));
}

// Another process may just be converting the "._" file, or the legacy folder, of an object:
// wherever it is seen no more, the stream is there.
TEST_P(EaOpenInEaDirTest, AStreamThatAnotherProcessMakesMeanwhileIsOpened) {
    for (const std::string& legacy : {sidecar_, folder_}) {
        for (int before = 2;; ++before) {
            SCOPED_TRACE(legacy + " " + std::to_string(before));
            std::filesystem::remove_all(ea_dir_);
            if (legacy == folder_) MakeEaDir();
            WriteFile(legacy, Ascii("stream"));  // converted by a rename alone
            int calls = 0;
            Hooks().before = [&](const std::string&) {
                if (++calls != before) return;
                (void)::mkdir(ea_dir_.c_str(), 0777);
                ASSERT_EQ(0, ::rename(legacy.c_str(), stream_.c_str()));
            };
            const Fd fd(OpenStream(0));
            Hooks().before = nullptr;
            TakeRecords();
            if (calls < before) break;
            EXPECT_EQ("stream", fd.Read());
        }
    }
}

TEST_P(EaOpenInEaDirTest, AMissingFileBesideOthersIsLookedForTwice) {
    MakeEaDir();
    TakeCalls();
    ExpectFailed(ENOENT, OpenStream(O_RDWR | O_TRUNC));
    EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDWR|O_TRUNC, 0777", "O_RDWR|O_TRUNC, 0777"));
}

TEST_P(EaOpenInEaDirTest, AFileThatAppearsBetweenTheTwoLooksIsOpened) {
    MakeEaDir();
    int opens = 0;
    Hooks().before = [&](const std::string& name) {
        if (name == "open" && ++opens == 2) WriteFile(stream_, Ascii("just made"));
    };
    const Fd fd(OpenStream(0));
    ASSERT_TRUE(fd.ok());
    EXPECT_EQ("just made", fd.Read());
    ExpectNothingReported();
}

TEST_P(EaOpenInEaDirTest, AnyOtherFailureOfTheFirstOpenIsFinal) {
    MakeEaDir();
    for (const int error : {EACCES, EMFILE, EISDIR, ENOTDIR, EEXIST, EIO}) {
        SCOPED_TRACE(strerror(error));
        TakeCalls();
        const FailCall fault("open", error);
        ExpectFailed(error, OpenStream(O_RDWR | O_CREAT));
        EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDWR, 0777"));
    }
    EXPECT_FALSE(Exists(stream_));
}

TEST_P(EaOpenInEaDirTest, AFailureOfTheSecondOpenIsFinal) {
    MakeEaDir();
    // Between the two, the upgrade opens what it looks for.
    TakeCallNames();
    ExpectFailed(ENOENT, OpenStream(0));
    const auto names = TakeCallNames();
    ASSERT_EQ("open", names.back());
    const auto last = std::count(names.begin(), names.end(), "open");
    const FailCall fault("open", ENOSPC, static_cast<int>(last));
    ExpectFailed(ENOSPC, OpenStream(O_RDWR | O_CREAT));
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDWR, 0777", "O_RDWR|O_CREAT, 0777"));
}

TEST_P(EaOpenInEaDirTest, ADirectoryInPlaceOfTheFileFailsWithEisdir) {
    MakeEaDir();
    ASSERT_EQ(0, ::mkdir(stream_.c_str(), 0777));
    TakeCalls();
    ExpectFailed(EISDIR, OpenStream(O_RDWR | O_CREAT));
    EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDWR, 0777"));
}

TEST_P(EaOpenInEaDirTest, AFileInPlaceOfTheEaDirectoryFailsWithEnotdir) {
    WriteFile(ea_dir_, Ascii("in the way"));
    ExpectFailed(ENOTDIR, OpenStream(O_RDWR | O_CREAT));
    ExpectFailed(ENOTDIR, OpenStream(0));
    EXPECT_EQ(Ascii("in the way"), ReadFile(ea_dir_));
}

// Promise: "MAVOEAOpen: otherwise the codes"
TEST_P(EaOpenInEaDirTest, AnEaDirectoryThatCannotBeMadeFailsWithItsCodeAndMakesNothing) {
    const std::string object = dir_ / "none/a.txt";
    TakeCalls();
    errno = 0;
    EXPECT_EQ(-1, Open(1, object.c_str(), kStream, O_RDWR | O_CREAT));
    EXPECT_EQ(ENOENT, errno);
    ExpectOnly(0x3C00, "ea_mkdir.c");
    EXPECT_THAT(OpensOf(dir_ / "none/@eaDir/a.txt@MavoEAStream"), ElementsAre("O_RDWR, 0777"));
}

TEST_P(EaOpenInEaDirTest, ATrailingSlashOfTheObjectIsIgnored) {
    const Fd fd(Open(1, (object_ + "/").c_str(), kStream, O_RDWR | O_CREAT));
    EXPECT_TRUE(fd.ok());
    EXPECT_TRUE(Exists(stream_));
}

TEST_P(EaOpenInEaDirTest, TheObjectItselfNeedNotExist) {
    const Fd fd(Open(1, (dir_ / "b").c_str(), kStream, O_RDWR | O_CREAT));
    EXPECT_TRUE(fd.ok());
    EXPECT_TRUE(Exists(ea_dir_ + "/b@MavoEAStream"));
    EXPECT_FALSE(Exists(dir_ / "b"));
}

TEST_P(EaOpenInEaDirTest, TheFolderFormMakesTheEaDirectoryAndTheFolderAndOpensOnce) {
    TakeCalls();
    const Fd fd(Open(0, object_.c_str(), "MAVO:Resource", O_RDWR | O_CREAT));
    ASSERT_TRUE(fd.ok());
    EXPECT_THAT(OpensOf(legacy_), ElementsAre("O_RDWR|O_CREAT, 0777"));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_EQ(0777, ModeOf(folder_));
    EXPECT_THAT(NamesIn(folder_), ElementsAre("MAVO:Resource"));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt"));
    ExpectNothingReported();
}

TEST_P(EaOpenInEaDirTest, TheFolderFormWithoutCreatingOpensOnceAndMakesNothing) {
    TakeCalls();
    ExpectFailed(ENOENT, Open(0, object_.c_str(), "MAVO:Resource", O_RDWR));
    EXPECT_THAT(OpensOf(legacy_), ElementsAre("O_RDWR, 0777"));
    EXPECT_FALSE(Exists(ea_dir_));
}

TEST_P(EaOpenInEaDirTest, TheFolderFormOpensWhatIsThere) {
    MakeEaDir();
    ASSERT_EQ(0, ::mkdir(folder_.c_str(), 0777));
    WriteFile(legacy_, Ascii("legacy"));
    TakeCalls();
    {
        const Fd fd(Open(0, object_.c_str(), "MAVO:Resource", 0));
        ASSERT_TRUE(fd.ok());
        EXPECT_EQ("legacy", fd.Read());
    }
    EXPECT_THAT(OpensOf(legacy_), ElementsAre("O_RDONLY, 0777"));
    {
        const Fd fd(Open(0, object_.c_str(), "MAVO:Resource", O_RDWR | O_CREAT | O_TRUNC));
        ASSERT_TRUE(fd.ok());
    }
    EXPECT_THAT(OpensOf(legacy_), ElementsAre("O_RDWR|O_CREAT|O_TRUNC, 0777"));
    EXPECT_EQ(Bytes(), ReadFile(legacy_));
    ExpectNothingReported();
}

TEST_P(EaOpenInEaDirTest, AnyOtherFormNamesTheFileAfterTheKindAloneAndLooksTwice) {
    for (const int form : {2, -1}) {
        SCOPED_TRACE(form);
        const std::string kind = "kind" + std::to_string(form);
        TakeCalls();
        const Fd fd(Open(form, object_.c_str(), kind.c_str(), O_RDWR | O_CREAT));
        EXPECT_TRUE(fd.ok());
        EXPECT_THAT(OpensOf(ea_dir_ + "/" + kind),
                    ElementsAre("O_RDWR, 0777", "O_RDWR|O_CREAT, 0777"));
        ExpectOnly(0xD00, "ea_upgrade");  // no kind of an earlier layout, which is no failure
    }
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("kind-1", "kind2"));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// Promise: "MAVOEAOpen: 0xD00 NULL argument"
TEST_P(EaOpenInEaDirTest, NullArgumentsFailWith0xD00AndEnoent) {
    TakeCallNames();
    for (const int oflag : {0, O_RDWR | O_CREAT}) {
        errno = 0;
        EXPECT_EQ(-1, Open(1, nullptr, kStream, oflag));
        EXPECT_EQ(ENOENT, errno);
        ExpectOnly(0xD00, kUnit);
        errno = 0;
        EXPECT_EQ(-1, Open(1, object_.c_str(), nullptr, oflag));
        EXPECT_EQ(ENOENT, errno);
        ExpectOnly(0xD00, kUnit);
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// Promise: "MAVOEAOpen: otherwise the codes"
TEST_P(EaOpenInEaDirTest, ErrorsOfThePathStandAsTheyWereRecorded) {
    TakeCallNames();
    EXPECT_EQ(-1, Open(1, "", kStream, O_RDWR | O_CREAT));
    ExpectOnly(0xD00, "ea_path");

    const std::string endless = "/" + std::string(5000, 'a');
    errno = 0;
    EXPECT_EQ(-1, Open(1, endless.c_str(), kStream, O_RDWR | O_CREAT));
    EXPECT_EQ(ENAMETOOLONG, errno);
    ExpectOnly(0xC300, "ea_path");
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// A form-1 path needs its length, that of the kind, and 9 bytes more, of which 4096 may be used.
TEST_P(EaOpenInEaDirTest, ThePathMayFillTheBufferOf4096Bytes) {
    const std::string longest = "/" + std::string(4096 - 9 - strlen(kStream) - 1, 'a');
    errno = 0;
    EXPECT_EQ(-1, Open(1, longest.c_str(), kStream, 0));
    EXPECT_EQ(ENOENT, errno);       // "/@eaDir/aa...": shortened, and not there
    ExpectOnly(0xC300, "ea_path");  // the upgrade's, which may use 4095 only
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_EQ(-1, Open(1, (longest + "a").c_str(), kStream, 0));
    ExpectOnly(0xC300, "ea_path");
}

TEST_P(EaOpenInEaDirTest, AFileOfTheLongestPathIsMade) {
    const std::size_t size = 4096 - 9 - strlen(kStream);
    std::string object = dir_.path() + (dir_.path().size() % 2 == 0 ? "" : "/");
    while (object.size() + 2 < size - 2) object += "/.";
    object += "/" + std::string(size - object.size() - 1, 'a');
    const Fd fd(Open(1, object.c_str(), kStream, O_RDWR | O_CREAT));
    EXPECT_TRUE(fd.ok()) << strerror(errno);
    ExpectOnly(0xC300, "ea_path");  // the upgrade's, which knows no path that long
}

// A call of the upgrade that fails may have missed what a new file would hide.
TEST_P(EaOpenInEaDirTest, EveryFailingCallIsReportedOnceAndLeavesNothingOpen) {
    for (const int form : {1, 0}) {
        int before_the_file = 0;
        int at_the_file = 0;
        int in_the_upgrade = 0;
        for (int nth = 1;; ++nth) {
            SCOPED_TRACE(std::to_string(form) + " " + std::to_string(nth));
            ASSERT_LT(nth, 100);
            const TempDir parent;
            const std::string object = parent / "a.txt";
            const std::string file =
                parent / (form == 1 ? "@eaDir/a.txt@MavoEAStream" : "@eaDir/a.txt/MavoEAStream");
            BeUser(kUser);
            TakeCalls();
            errno = 0;
            const FailNthCall fault(nth, EIO);
            const int fd = Open(form, object.c_str(), kStream, O_RDWR | O_CREAT);
            const int error = errno;
            const auto opens = OpensOf(file);
            if (fd >= 0) ::close(fd);
            EXPECT_EQ(descriptors_, OpenDescriptors());
            EXPECT_EQ(live_blocks_, TakeAllocations().live);
            if (!fault.fired()) {
                EXPECT_LE(0, fd);
                ExpectNothingReported();
                EXPECT_EQ(kUser, uid_);
                break;
            }
            SCOPED_TRACE(fault.name());
            if (fault.name() == "seteuid" && fd >= 0) {  // back again: not looked at
                EXPECT_EQ(0u, uid_);
                ExpectNothingReported();
                continue;
            }
            EXPECT_EQ(kUser, uid_);
            if (fd >= 0) {
                EXPECT_THAT(opens, ElementsAre("O_RDWR, 0777", "O_RDWR|O_CREAT, 0777"));
                EXPECT_TRUE(Exists(file));
                ExpectNothingReported();
                continue;
            }
            EXPECT_EQ(-1, fd);
            EXPECT_EQ(EIO, error);
            EXPECT_FALSE(Exists(file));
            if (opens.empty()) {
                ++before_the_file;
                EXPECT_EQ(1u, TakeRecords().size());
            } else if (fault.name() != "open") {
                ++in_the_upgrade;
                ExpectOnly(0x900, "ea_upgrade");
            } else {
                ++at_the_file;
                EXPECT_EQ("open", fault.name());
                ExpectNothingReported();
            }
        }
        EXPECT_LT(3, before_the_file);
        EXPECT_EQ(form == 1 ? 2 : 1, at_the_file);
        EXPECT_EQ(form == 1, in_the_upgrade > 0);
    }
}

// ---- What earlier versions left -------------------------------------------------------------

class EaOpenUpgradeTest : public EaOpenInEaDirTest {
 protected:
    using Values = std::map<std::string, Bytes>;

    void SetUp() override {
        EaOpenInEaDirTest::SetUp();
        // The object has legacy metadata of every kind.
        std::filesystem::create_directories(folder_);
        for (const auto& [name, value] : values_) WriteFile(folder_ + "/" + name, value);
        WriteFile(legacy_, Ascii("resource"));
    }

    // The descriptor is that of a stream with these attributes.
    static void ExpectStreamOn(int fd, const Values& values) {
        EASHandle* const handle = MAVOEASOpen(fd, F_RDLCK);
        ASSERT_NE(nullptr, handle);
        for (const auto& [name, value] : values) {
            Bytes read(value.size() + 1);
            EXPECT_EQ(static_cast<int>(value.size()),
                      MAVOEASRead(handle, name.c_str(), read.data(),
                                  static_cast<unsigned>(read.size()), 0));
            read.pop_back();
            EXPECT_EQ(value, read);
        }
        EXPECT_EQ(0, MAVOEASClose(handle));
    }

    // The open failed although only the upgrade recorded anything.
    static void ExpectFailedAfter(int code, int error, int fd) {
        const int found = errno;
        EXPECT_EQ(-1, fd);
        EXPECT_EQ(error, found) << strerror(found);
        ExpectOnly(code, "ea_upgrade");
    }

    void ExpectLegacyMetadataUntouched() const {
        EXPECT_THAT(NamesIn(folder_), ElementsAre("MAVO:Resource", "color", "tags"));
        EXPECT_EQ(Ascii("blue"), ReadFile(folder_ + "/color"));
        EXPECT_EQ(Ascii("resource"), ReadFile(legacy_));
    }

    // The calls since the last time did not look for earlier layouts.
    static void ExpectNoUpgrade() {
        EXPECT_THAT(TakeCallNames(), Not(Contains(AnyOf("access", "opendir", "rename", "rmdir"))));
    }

    const Values values_ = {{"color", Ascii("blue")}, {"tags", Ascii("work, home")}};
};

INSTANTIATE_TEST_SUITE_P(With, EaOpenUpgradeTest, ::testing::Bool(), [](const auto& through) {
    return through.param ? "MAVOEAOpen" : "MAVOEAOpenNoADFS";
});

// Promise: "MAVOEAOpen: What is missing is first looked"
// Promise: "MAVOEAUpgrade: MAVOEAOpen() calls this"
TEST_P(EaOpenUpgradeTest, AnObjectWithOnlyALegacyFolderGivesADescriptorOfTheUpgradedStream) {
    std::filesystem::remove(legacy_);
    TakeCalls();
    const int fd = OpenStream(0);
    ASSERT_LE(0, fd);
    const auto opens = OpensOf(stream_);
    ASSERT_LE(2u, opens.size());
    EXPECT_EQ("O_RDONLY, 0777", opens.front());
    EXPECT_EQ("O_RDONLY, 0777", opens.back());
    ExpectStreamOn(fd, values_);
    EXPECT_EQ(O_RDONLY, fcntl(fd, F_GETFL) & O_ACCMODE);
    ::close(fd);
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt@MavoEAStream"));
    ExpectNothingReported();
}

TEST_P(EaOpenUpgradeTest, AnObjectWithOnlyASidecarGivesADescriptorOfIt) {
    std::filesystem::remove_all(ea_dir_);
    const MacFile file = MacSidecar({.attributes = values_, .fork = Ascii("fork")});
    WriteFile(sidecar_, file.bytes);
    const int fd = OpenStream(0);
    ASSERT_LE(0, fd);
    ExpectStreamOn(fd, values_);
    ::close(fd);
    EXPECT_EQ(file.bytes, ReadFile(stream_));
    EXPECT_FALSE(Exists(sidecar_));
    ExpectNothingReported();
}

TEST_P(EaOpenUpgradeTest, CreatingGivesTheUpgradedStreamAndNoEmptyOne) {
    const int fd = OpenStream(O_RDWR | O_CREAT);
    ASSERT_LE(0, fd);
    ExpectStreamOn(fd, values_);
    ::close(fd);
    EXPECT_THAT(NamesIn(folder_), ElementsAre("MAVO:Resource"));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: 1 the current layout"
TEST_P(EaOpenUpgradeTest, AFileThatAppearsMeanwhileIsNotReplacedByALegacyOne) {
    for (const int oflag : {0, O_RDWR | O_CREAT}) {
        SCOPED_TRACE(oflag);
        std::filesystem::remove_all(folder_ + "/color");
        std::filesystem::remove_all(folder_ + "/tags");
        WriteFile(sidecar_, MacSidecar({.attributes = values_}).bytes);
        for (const auto& one : {std::pair{kStream, stream_}, {kResource, resource_}}) {
            const auto& kind = one.first;
            const std::string& file = one.second;
            SCOPED_TRACE(kind);
            Hooks().before = [&, made = false](const std::string& name) mutable {
                if (name == "open" || made) return;
                if (name == "opendir" || (kind == kResource && name == "access")) {
                    WriteFile(file, Ascii("new"));
                    made = true;
                }
            };
            const Fd fd(Open(1, object_.c_str(), kind, oflag));
            Hooks().before = nullptr;
            EXPECT_EQ("new", fd.Read());
            ExpectNothingReported();
        }
        EXPECT_EQ(MacSidecar({.attributes = values_}).bytes, ReadFile(sidecar_));
        EXPECT_EQ(Ascii("resource"), ReadFile(legacy_));
        std::filesystem::remove(stream_);
        std::filesystem::remove(resource_);
    }
}

TEST_P(EaOpenUpgradeTest, TheLegacyResourceFileIsFoundToo) {
    {
        const Fd fd(Open(1, object_.c_str(), kResource, 0));
        EXPECT_EQ("resource", fd.Read());
    }
    EXPECT_THAT(NamesIn(folder_), ElementsAre("color", "tags"));
    EXPECT_EQ(Ascii("resource"), ReadFile(resource_));
}

// Promise: "MAVOEAOpen: What is missing is first looked"
TEST_P(EaOpenUpgradeTest, TheFolderFormNeverUpgrades) {
    for (const int oflag : {0, O_RDWR | O_CREAT}) {
        for (const char* kind : {kStream, kResource, "MAVO:x"}) {
            SCOPED_TRACE(kind);
            TakeCallNames();
            const Fd fd(Open(0, object_.c_str(), kind, oflag));
            EXPECT_EQ((oflag & O_CREAT) != 0, fd.ok());
            ExpectNoUpgrade();
            std::filesystem::remove(folder_ + "/" + kind);
        }
    }
    ExpectLegacyMetadataUntouched();
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt"));
    ExpectNothingReported();
}

// The kind alone names the file, but the object is what is upgraded.
// Promise: "MAVOEAOpen: What is missing is first looked"
TEST_P(EaOpenUpgradeTest, EveryOtherFormUpgrades) {
    ExpectFailed(ENOENT, Open(2, object_.c_str(), kStream, 0));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt", "a.txt@MavoEAStream"));
    EXPECT_THAT(NamesIn(folder_), ElementsAre("MAVO:Resource"));
}

// Promise: "MAVOEAOpen: What is missing is first looked"
TEST_P(EaOpenUpgradeTest, AFileThatIsThereIsOpenedWithoutAnUpgrade) {
    WriteFile(stream_, Ascii("stream"));
    for (const int oflag : {0, O_RDWR | O_CREAT}) {
        TakeCallNames();
        const Fd fd(OpenStream(oflag));
        EXPECT_EQ("stream", fd.Read());
        ExpectNoUpgrade();
    }
    ExpectLegacyMetadataUntouched();
}

TEST_P(EaOpenUpgradeTest, AFailureOtherThanEnoentIsFinalWithoutAnUpgrade) {
    for (const int error : {EACCES, EMFILE, EISDIR, ENOTDIR, ENAMETOOLONG, ELOOP, EIO}) {
        SCOPED_TRACE(strerror(error));
        TakeCallNames();
        const FailCall fault("open", error);
        ExpectFailed(error, OpenStream(O_RDWR | O_CREAT));
        ExpectNoUpgrade();
    }
    ExpectLegacyMetadataUntouched();
    EXPECT_FALSE(Exists(stream_));
}

// Promise: "MAVOEAOpen: its failures leave their codes"
TEST_P(EaOpenUpgradeTest, AFailureOfTheUpgradeThatHidesNothingIsIgnored) {
    {
        const FailCall fault("rmdir", EBUSY);
        const int fd = OpenStream(0);
        ASSERT_LE(0, fd);
        ExpectOnly(0x3900, "ea_upgrade");
        ExpectStreamOn(fd, values_);
        ::close(fd);
    }
    {
        const FailCall fault("rename", EIO);
        ExpectFailedAfter(0x2800, ENOENT, Open(1, object_.c_str(), kResource, 0));
    }
    const Fd fd(Open(1, object_.c_str(), "kind", O_RDWR | O_CREAT));
    ExpectOnly(0xD00, "ea_upgrade");
    EXPECT_TRUE(fd.ok());
    std::filesystem::remove_all(folder_);
    WriteFile(folder_, Ascii("in the folder's place"));
    const Fd new_fd(OpenStream(O_RDWR | O_CREAT));
    std::filesystem::remove(stream_);
    const Fd another_fd(OpenStream(O_RDWR | O_CREAT));
    EXPECT_TRUE(another_fd.ok());
    EXPECT_THAT(TakeRecords(), ::testing::Each(RecordOf(0x3900, "ea_upgrade")));
}

// Promise: "MAVOEAOpen: Where it fails"
TEST_P(EaOpenUpgradeTest, NothingIsMadeOverWhatAFailedUpgradeLeaves) {
    {
        const FailCall fault("rename", EIO);
        ExpectFailedAfter(0x2800, EIO, Open(1, object_.c_str(), kResource, O_RDWR | O_CREAT));
    }
    {
        const FailCall fault("opendir", EMFILE);
        ExpectFailedAfter(0x900, EMFILE, OpenStream(O_RDWR | O_CREAT));
    }
    {
        const FailCall fault("readdir", EIO);
        ExpectFailedAfter(0xA00, EIO, OpenStream(O_RDWR | O_CREAT));
    }
    ExpectLegacyMetadataUntouched();
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt"));

    std::filesystem::remove_all(folder_);
    WriteFile(sidecar_, MacSidecar({.attributes = values_}).bytes);
    const FailCall fault("rename", EIO);
    ExpectFailedAfter(0x2800, EIO, OpenStream(O_RDWR | O_CREAT));
    EXPECT_EQ(MacSidecar({.attributes = values_}).bytes, ReadFile(sidecar_));
    EXPECT_THAT(NamesIn(ea_dir_), IsEmpty());
}

// Whatever fails, a descriptor is one of a stream that has what could be read.
// Promise: "MAVOEAOpen: Where it fails"
TEST_P(EaOpenUpgradeTest, WhateverFailsNoFileIsMadeOverAttributes) {
    std::filesystem::remove(legacy_);
    const auto make = [this] {
        std::filesystem::remove_all(ea_dir_);
        std::filesystem::create_directories(folder_);
        for (const auto& [name, value] : values_) WriteFile(folder_ + "/" + name, value);
    };
    int refused = 0;
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        ASSERT_LT(nth, 200);
        make();
        TakeRecords();
        const FailNthCall fault(nth, EIO);
        errno = 0;
        const Fd fd(OpenStream(O_RDWR | O_CREAT));
        const int error = errno;
        if (!fault.fired()) break;
        SCOPED_TRACE(fault.name());
        if (!fd.ok()) {
            ++refused;
            EXPECT_EQ(EIO, error);
            const bool whole = Exists(stream_);  // the last open failed
            EXPECT_EQ(whole ? 0u : values_.size(), Exists(folder_) ? NamesIn(folder_).size() : 0);
            continue;
        }
        const auto contents = ReadMacFile(ReadFile(stream_));
        ASSERT_TRUE(contents);
        EXPECT_LE(values_.size() - 1, contents->attributes.size());
    }
    EXPECT_LT(10, refused);
    TakeLog();
}

// ---- As another user ------------------------------------------------------------------------

TEST_P(EaOpenInEaDirTest, TheDirectoryIsMadeByTheSuperuserAndTheFileByTheUser) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    ASSERT_EQ(0, chmod(dir_.path().c_str(), 0755));  // the user may not write here
    AsUser(kUser, Root::kSaved, [this] {
        const Fd fd(OpenStream(O_RDWR | O_CREAT));
        EXPECT_TRUE(fd.ok()) << strerror(errno);
        EXPECT_EQ(kUser, ::geteuid());
    });
    struct stat info;
    ASSERT_EQ(0, stat(ea_dir_.c_str(), &info));
    EXPECT_EQ(0u, info.st_uid);
    ASSERT_EQ(0, stat(stream_.c_str(), &info));
    EXPECT_EQ(kUser, info.st_uid);
}

// Promise: "MAVOEAOpen: Returns a descriptor"
TEST_P(EaOpenInEaDirTest, AFileThatTheUserMayNotOpenFailsWithEaccesOnce) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    ASSERT_EQ(0, chmod(stream_.c_str(), 0600));
    AsUser(65534, Root::kGivenUp, [this] {
        TakeCalls();
        ExpectFailed(EACCES, OpenStream(0));
        EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDONLY, 0777"));
    });
    AsUser(kUser, Root::kSaved, [this] {
        TakeCalls();
        ExpectFailed(EACCES, OpenStream(O_RDWR | O_CREAT));
        EXPECT_THAT(OpensOf(stream_), ElementsAre("O_RDWR, 0777"));
    });
}

// Promise: "MAVOEAMKDir: 0x3C00"
// Promise: "MAVOEAOpen: With O_CREAT the EA directory"
TEST_P(EaOpenInEaDirTest, WhoCannotBecomeTheSuperuserCannotCreateEvenWhereTheDirectoryExists) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    MakeEaDir();
    ASSERT_EQ(0, chmod(ea_dir_.c_str(), 0777));
    WriteFile(stream_, Ascii("stream"));
    AsUser(65534, Root::kGivenUp, [this] {
        EXPECT_EQ(-1, OpenStream(O_RDWR | O_CREAT));
        EXPECT_EQ(EPERM, errno);
        ExpectOnly(0x3C00, "ea_mkdir.c");
        const Fd fd(OpenStream(0));
        EXPECT_EQ("stream", fd.Read());
    });
}

// ---- Beside the object ----------------------------------------------------------------------

class EaOpenAppleDoubleTest : public EaOpenTest {
 protected:
    int Open(int oflag) const { return MAVOEAOpen(1, object_.c_str(), kStream, oflag, 1); }
};

TEST_F(EaOpenAppleDoubleTest, CreatingMakesTheFileBesideTheObjectAndNoEaDirectory) {
    TakeCalls();
    {
        const Fd fd(Open(O_RDWR | O_CREAT));
        ASSERT_TRUE(fd.ok());
        EXPECT_TRUE(fd.Write("double"));
    }
    EXPECT_THAT(OpensOf(sidecar_), ElementsAre("O_RDWR, 0777", "O_RDWR|O_CREAT, 0777"));
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("._a.txt", "a.txt"));
    EXPECT_EQ(Ascii("double"), ReadFile(sidecar_));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

TEST_F(EaOpenAppleDoubleTest, NothingButTheTwoOpensIsCalled) {
    TakeCallNames();
    ExpectFailed(ENOENT, Open(0));
    EXPECT_THAT(TakeCallNames(), ElementsAre("open", "open"));
}

TEST_F(EaOpenAppleDoubleTest, NoUpgradeIsTried) {
    std::filesystem::create_directories(folder_);
    WriteFile(folder_ + "/color", Ascii("blue"));
    TakeCallNames();
    ExpectFailed(ENOENT, Open(0));
    const Fd fd(Open(O_RDWR | O_CREAT));
    EXPECT_TRUE(fd.ok());
    EXPECT_THAT(TakeCallNames(), ElementsAre("open", "open", "open", "open"));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt"));
    EXPECT_EQ(Ascii("blue"), ReadFile(folder_ + "/color"));
}

TEST_F(EaOpenAppleDoubleTest, TheUmaskNarrowsTheFile) {
    const Umask umask(022);
    const Fd fd(Open(O_RDWR | O_CREAT));
    EXPECT_TRUE(fd.ok());
    EXPECT_EQ(0755, ModeOf(sidecar_));
}

TEST_F(EaOpenAppleDoubleTest, AFileThatExistsIsOpenedOnce) {
    WriteFile(sidecar_, Ascii("double"));
    TakeCalls();
    {
        const Fd fd(Open(O_RDWR | O_CREAT));
        EXPECT_EQ("double", fd.Read());
    }
    EXPECT_THAT(OpensOf(sidecar_), ElementsAre("O_RDWR, 0777"));
    {
        const Fd fd(Open(0));
        EXPECT_EQ("double", fd.Read());
        EXPECT_FALSE(fd.Write("x"));
    }
    EXPECT_THAT(OpensOf(sidecar_), ElementsAre("O_RDONLY, 0777"));
    {
        const Fd fd(Open(O_RDWR | O_CREAT | O_TRUNC));
        EXPECT_EQ("", fd.Read());
    }
    EXPECT_THAT(OpensOf(sidecar_), ElementsAre("O_RDWR|O_TRUNC, 0777"));
    EXPECT_EQ(Bytes(), ReadFile(sidecar_));
    ExpectNothingReported();
}

TEST_F(EaOpenAppleDoubleTest, TruncatingCreatesAFileThatIsMissing) {
    TakeCalls();
    const Fd fd(Open(O_RDWR | O_CREAT | O_TRUNC));
    EXPECT_TRUE(fd.ok());
    EXPECT_THAT(OpensOf(sidecar_),
                ElementsAre("O_RDWR|O_TRUNC, 0777", "O_RDWR|O_CREAT|O_TRUNC, 0777"));
}

TEST_F(EaOpenAppleDoubleTest, FormAndKindAreNotUsed) {
    WriteFile(sidecar_, Ascii("double"));
    for (const int form : {0, 1, 2, -1}) {
        SCOPED_TRACE(form);
        const Fd fd(MAVOEAOpen(form, object_.c_str(), "whatever", O_RDWR | O_CREAT, 1));
        EXPECT_EQ("double", fd.Read());
    }
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("._a.txt", "a.txt"));
}

TEST_F(EaOpenAppleDoubleTest, AMissingFileFailsWithEnoentAfterASecondLook) {
    TakeCalls();
    ExpectFailed(ENOENT, Open(0));
    EXPECT_THAT(OpensOf(sidecar_), ElementsAre("O_RDONLY, 0777", "O_RDONLY, 0777"));
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("a.txt"));
}

TEST_F(EaOpenAppleDoubleTest, AnyOtherFailureOfTheFirstOpenIsFinal) {
    for (const int error : {EACCES, EMFILE, EISDIR, EIO}) {
        SCOPED_TRACE(strerror(error));
        TakeCalls();
        const FailCall fault("open", error);
        ExpectFailed(error, Open(O_RDWR | O_CREAT));
        EXPECT_THAT(OpensOf(sidecar_), ElementsAre("O_RDWR, 0777"));
    }
    EXPECT_FALSE(Exists(sidecar_));
}

TEST_F(EaOpenAppleDoubleTest, AFailureOfTheSecondOpenIsFinal) {
    const FailCall fault("open", ENOSPC, 2);
    ExpectFailed(ENOSPC, Open(O_RDWR | O_CREAT));
}

TEST_F(EaOpenAppleDoubleTest, ADirectoryInPlaceOfTheFileFailsWithEisdir) {
    ASSERT_EQ(0, ::mkdir(sidecar_.c_str(), 0777));
    ExpectFailed(EISDIR, Open(O_RDWR));
}

TEST_F(EaOpenAppleDoubleTest, AFileThatTheUserMayNotOpenFailsWithEacces) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    WriteFile(sidecar_, Ascii("double"));
    ASSERT_EQ(0, chmod(sidecar_.c_str(), 0600));
    AsUser(65534, Root::kGivenUp, [this] { ExpectFailed(EACCES, Open(O_RDWR | O_CREAT)); });
}

TEST_F(EaOpenAppleDoubleTest, WhoCannotBecomeTheSuperuserCreatesIt) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    BeWhoWeAre();
    AsUser(65534, Root::kGivenUp, [this] {
        const Fd fd(Open(O_RDWR | O_CREAT));
        EXPECT_TRUE(fd.ok()) << strerror(errno);
        ExpectNothingReported();
    });
    EXPECT_TRUE(Exists(sidecar_));
}

// Promise: "MAVOEAOpen: What is there is opened"
TEST_F(EaOpenAppleDoubleTest, AFileThatExistsIsOpenedWithExclusiveCreationToo) {
    WriteFile(sidecar_, Ascii("sidecar"));
    const Fd fd(Open(O_RDWR | O_CREAT | O_EXCL));
    ASSERT_TRUE(fd.ok());
    EXPECT_EQ("sidecar", fd.Read());
    ExpectNothingReported();
}

TEST_F(EaOpenAppleDoubleTest, NullArgumentsFailWith0xD00AndEnoent) {
    TakeCallNames();
    errno = 0;
    EXPECT_EQ(-1, MAVOEAOpen(1, nullptr, kStream, O_RDWR | O_CREAT, 1));
    EXPECT_EQ(ENOENT, errno);
    ExpectOnly(0xD00, kUnit);
    errno = 0;
    EXPECT_EQ(-1, MAVOEAOpen(1, object_.c_str(), nullptr, O_RDWR | O_CREAT, 1));
    EXPECT_EQ(ENOENT, errno);
    ExpectOnly(0xD00, kUnit);
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(EaOpenAppleDoubleTest, ANameThatIsTooLongForTheFileFailsWith0xC300AndKeepsErrno) {
    const std::string longest = dir_ / std::string(253, 'a');
    {
        const Fd fd(MAVOEAOpen(1, longest.c_str(), kStream, O_RDWR | O_CREAT, 1));
        EXPECT_TRUE(fd.ok());
    }
    TakeCallNames();
    errno = EXDEV;
    EXPECT_EQ(-1, MAVOEAOpen(1, (longest + "a").c_str(), kStream, O_RDWR | O_CREAT, 1));
    EXPECT_EQ(EXDEV, errno);
    ExpectOnly(0xC300, "ea_adpath");
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

// ---- Any other place ------------------------------------------------------------------------

// Promise: "MAVOEAOpen: 0xD00 NULL argument"
TEST_F(EaOpenTest, AnyOtherPlaceFailsWith0xD00) {
    TakeCallNames();
    for (const int place : {-1, 2, 3, 7, 256}) {
        SCOPED_TRACE(place);
        EXPECT_EQ(-1, MAVOEAOpen(1, object_.c_str(), kStream, O_RDWR | O_CREAT, place));
        ExpectOnly(0xD00, kUnit);
        EXPECT_EQ(-1, MAVOEAOpen(1, nullptr, nullptr, 0, place));
        ExpectOnly(0xD00, kUnit);
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("a.txt"));
}

// ---- How the kernel is asked --------------------------------------------------------------------

constexpr int kAccessModes[] = {O_RDONLY, O_WRONLY, O_RDWR};

TEST_F(EaOpenTest, ADescriptorHasTheFlagsThatWereAskedForAndNoOthers) {
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    WriteFile(sidecar_, Ascii("double"));
    for (const int place : {0, 1}) {
        for (const int mode : kAccessModes) {
            for (const int more : {0, O_APPEND, O_NONBLOCK, O_APPEND | O_NONBLOCK, O_CREAT}) {
                SCOPED_TRACE(testing::Message() << place << " " << mode << " " << more);
                const Fd fd(MAVOEAOpen(1, object_.c_str(), kStream, mode | more, place));
                ASSERT_TRUE(fd.ok());
                const int kept = O_ACCMODE | O_APPEND | O_NONBLOCK;
                EXPECT_EQ((mode | more) & kept, fcntl(fd.get(), F_GETFL) & kept);
            }
        }
    }
    for (const int mode : kAccessModes) {  // One that is made.
        ASSERT_EQ(0, unlink(stream_.c_str()));
        const Fd fd(MAVOEAOpen(1, object_.c_str(), kStream, mode | O_CREAT, 0));
        ASSERT_TRUE(fd.ok());
        EXPECT_EQ(mode, fcntl(fd.get(), F_GETFL) & (O_ACCMODE | O_NONBLOCK));
    }
}

// Opens in a process of its own what this one has a lease on, and gives the lease up once it is
// told that somebody waits. What `opens` says then.
bool OnceTheLeaseIsGone(const std::string& path, const std::function<bool()>& opens) {
    sigset_t told;
    sigset_t former;
    sigemptyset(&told);
    sigaddset(&told, SIGIO);
    sigprocmask(SIG_BLOCK, &told, &former);
    const Fd lease(::open(path.c_str(), O_RDWR));
    EXPECT_EQ(0, fcntl(lease.get(), F_SETLEASE, F_WRLCK)) << strerror(errno);
    fflush(nullptr);
    const pid_t child = fork();
    if (child == 0) {
        alarm(20);
        _exit(opens() ? 0 : 1);
    }
    // A child that does not wait is gone before the lease is.
    const timespec most = {.tv_sec = 10, .tv_nsec = 0};
    EXPECT_EQ(SIGIO, sigtimedwait(&told, nullptr, &most));
    siginfo_t gone = {};
    EXPECT_EQ(0, waitid(P_PID, static_cast<id_t>(child), &gone, WEXITED | WNOHANG | WNOWAIT));
    EXPECT_EQ(0, fcntl(lease.get(), F_SETLEASE, F_UNLCK));
    int status = 0;
    EXPECT_EQ(child, waitpid(child, &status, 0));
    sigprocmask(SIG_SETMASK, &former, nullptr);
    return status == 0;
}

// Promise: "MAVOEAOpen: Waits"
TEST_F(EaOpenTest, ALeaseIsWaitedForAsByAPlainOpen) {
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    {
        const Fd fd(::open(stream_.c_str(), O_RDWR));
        if (fcntl(fd.get(), F_SETLEASE, F_WRLCK) != 0) GTEST_SKIP() << "no leases here";
    }
    for (const int mode : kAccessModes) {
        for (const int more : {0, O_CREAT, O_TRUNC}) {
            SCOPED_TRACE(testing::Message() << mode << " " << more);
            EXPECT_TRUE(OnceTheLeaseIsGone(stream_, [&] {
                const int fd = MAVOEAOpen(1, object_.c_str(), kStream, mode | more, 0);
                return fd >= 0 && (fcntl(fd, F_GETFL) & O_NONBLOCK) == 0;
            }));
        }
    }
    EXPECT_EQ(Bytes(), ReadFile(stream_));  // O_TRUNC did its work.

    WriteFile(resource_, Bytes(741));
    EXPECT_TRUE(OnceTheLeaseIsGone(resource_, [&] {
        EAAdouble record = {};
        (void)MAVOEAEADirAdoubleRead(object_.c_str(), &record);
        return MLIBCErrGet() == MAVOEA_ERR_READ;  // what is in it, and not that it was refused
    }));
}

TEST_F(EaOpenTest, ALeaseIsNotWaitedForByWhoAsksNotTo) {
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    const Fd lease(::open(stream_.c_str(), O_RDWR));
    if (fcntl(lease.get(), F_SETLEASE, F_WRLCK) != 0) GTEST_SKIP() << "no leases here";
    signal(SIGIO, SIG_IGN);
    WithoutWaiting([&] {
        for (const int mode : kAccessModes) {
            ExpectFailed(EWOULDBLOCK,
                         MAVOEAOpen(1, object_.c_str(), kStream, mode | O_NONBLOCK, 0));
        }
    });
    signal(SIGIO, SIG_DFL);
}

#ifdef SYS_statx
// As kernels and sandboxes that do not know the call refuse it: each with an errno of its own.
bool RefuseStatx(int error) {
    sock_filter code[] = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_statx, 0, 1),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | static_cast<unsigned>(error)),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
    };
    const sock_fprog program = {.len = std::size(code), .filter = code};
    return prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
           prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

TEST_F(EaOpenTest, WhereStatxIsRefusedTheKindIsAskedOtherwise) {
    MAVOEA_SKIP_IN_EMULATOR("it has no filters of system calls");
    MakeEaDir();
    WriteFile(stream_, Ascii("stream"));
    ASSERT_EQ(0, mkfifo(resource_.c_str(), 0666));
    for (const int error : {ENOSYS, EPERM, EINVAL, EACCES}) {
        SCOPED_TRACE(strerror(error));
        WithoutWaiting([&] {
            if (!RefuseStatx(error)) return;
            for (const int mode : kAccessModes) {
                EXPECT_TRUE(Fd(MAVOEAOpen(1, object_.c_str(), kStream, mode, 0)).ok());
                ExpectFailed(ENXIO, MAVOEAOpen(1, object_.c_str(), kResource, mode, 0));
            }
        });
    }
}
#endif

}  // namespace
}  // namespace mavoea::test

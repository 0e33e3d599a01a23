// What libmavoea-threads(7) says of the shared libraries: threads, locks, children and signals.

#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdarg.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "include/mavoea.h"
#include "platform/include/mavoacl.h"
#include "platform/include/mavocore.h"
#include "tests/support/process.h"
#include "tests/support/second_volume.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::Not;

constexpr uid_t kUser = 12345;

// Called in the midst of a call: when the library changes a mode, and gives an ACL.
std::function<void()> meanwhile;
void CallMeanwhile() {
    if (meanwhile) meanwhile();
}

// The programs that were run, by their paths.
std::vector<std::string> programs;

}  // namespace
}  // namespace mavoea::test

// The libraries call these in the place of those of libc, libmavoacl and libmavocore.

extern "C" __attribute__((visibility("default"))) int chmod(const char* path,
                                                            mode_t mode) noexcept {
    mavoea::test::CallMeanwhile();
    return static_cast<int>(syscall(SYS_fchmodat, AT_FDCWD, path, mode));
}

int MAVOACLSetEADirACL(const char* /*szPath*/) {
    mavoea::test::CallMeanwhile();
    return 0;
}

int MLIBCExec(const char* szProgram, ...) {
    mavoea::test::programs.emplace_back(szProgram);
    std::array<const char*, 6> given = {};
    va_list list;
    va_start(list, szProgram);
    for (const char*& argument : given) {
        argument = va_arg(list, const char*);
        if (argument == nullptr) break;
    }
    va_end(list);
    const auto real = reinterpret_cast<decltype(&MLIBCExec)>(dlsym(RTLD_NEXT, "MLIBCExec"));
    return real(szProgram, given[0], given[1], given[2], given[3], given[4], given[5],
                static_cast<const char*>(nullptr));
}

namespace mavoea::test {
namespace {

class Descriptor {
 public:
    explicit Descriptor(const std::string& path) : fd_(open(path.c_str(), O_RDWR | O_CLOEXEC)) {}
    ~Descriptor() { close(fd_); }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;

    int get() const { return fd_; }

 private:
    int fd_;
};

void InThread(const std::function<void()>& body) { std::thread(body).join(); }

// Runs `body` in a child process; expectations that fail in it fail the test here.
void InChild(const std::function<void()>& body) {
    fflush(nullptr);
    const pid_t child = fork();
    ASSERT_LE(0, child) << strerror(errno);
    if (child == 0) {
        body();
        fflush(nullptr);
        _exit(::testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    ASSERT_EQ(child, waitpid(child, &status, 0)) << strerror(errno);
    EXPECT_EQ(0, status);
}

// Who keeps this process from locking a file for writing, by process id; 0 nobody, -1 on failure.
pid_t LockedBy(int fd) {
    struct flock64 lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    if (fcntl(fd, F_GETLK64, &lock) != 0) return -1;
    return lock.l_type == F_UNLCK ? 0 : lock.l_pid;
}

class ThreadsTest : public ::testing::Test {
 protected:
    ThreadsTest() {
        chmod(dir_.path().c_str(), 0777);
        WriteFile(stream_, {});
    }
    ~ThreadsTest() override { meanwhile = nullptr; }

    TempDir dir_;
    std::string stream_ = dir_ / "stream";  // a new one
};

// ---- Threads ------------------------------------------------------------------------------------

// Promise: "THREADS: The error stack is each thread's own"
TEST_F(ThreadsTest, ACallThatFailsRecordsOnTheStackOfItsThread) {
    MLIBCErrSetEx(0, "", 0);
    InThread([] {
        EXPECT_EQ(0, MLIBCErrGet());
        EXPECT_EQ(-1, MAVOEASFlush(nullptr));
        EXPECT_EQ(MAVOEA_ERR_BAD_ARGUMENT, MLIBCErrGet());
    });
    EXPECT_EQ(0, MLIBCErrGet());
}

// Promise: "THREADS: They share the effective user id"
// Promise: "THREADS: While *MAVOEAMKDir*(3) runs"
// Promise: "THREADS: Afterwards it is the caller's again"
TEST_F(ThreadsTest, WhileAnEaDirectoryIsMadeOtherThreadsAreTheSuperuserToo) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    AsUser(kUser, Root::kSaved, [&] {
        int looked = 0;
        meanwhile = [&] {
            ++looked;
            InThread([] { EXPECT_EQ(0U, geteuid()); });
        };
        InThread([] { EXPECT_EQ(kUser, geteuid()); });
        EXPECT_EQ(0, MAVOEAMKDir(0, (dir_ / "@eaDir").c_str()));
        EXPECT_EQ(1, looked);
        EXPECT_EQ(kUser, geteuid());
        InThread([] { EXPECT_EQ(kUser, geteuid()); });

        rmdir((dir_ / "@eaDir").c_str());
        const std::string object = dir_ / "object";
        const int fd =
            MAVOEAOpenNoADFS(EA_FORM_FILE, object.c_str(), MAVOEA_KIND_STREAM, O_RDWR | O_CREAT);
        EXPECT_LE(0, fd);
        close(fd);
        EXPECT_EQ(2, looked);
        InThread([] { EXPECT_EQ(kUser, geteuid()); });

        // After a failure, too.
        EXPECT_EQ(-1, MAVOEAMKDir(0, (dir_ / "none/@eaDir").c_str()));
        InThread([] { EXPECT_EQ(kUser, geteuid()); });
    });
}

// The host has no filesystem with forks: that there is none is found out in the midst of it.
// Promise: "THREADS: While *MAVOEAMKDir*(3) runs"
// Promise: "THREADS: Afterwards it is the caller's again"
TEST_F(ThreadsTest, WhileAResourceForkIsUsedOtherThreadsAreTheSuperuserToo) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    AsUser(kUser, Root::kSaved, [&] {
        const std::string object = dir_ / "object";
        WriteFile(object, {});
        int looked = 0;
        meanwhile = [&] {
            ++looked;
            InThread([] { EXPECT_EQ(0U, geteuid()); });
        };
        char byte = 0;
        EXPECT_EQ(-1, MAVOEAXattrGet(object.c_str(), "com.apple.ResourceFork", &byte, 1));
        EXPECT_EQ(-1, MAVOEAXattrSet(object.c_str(), "com.apple.ResourceFork", &byte, 1, 0));
        EXPECT_EQ(-1, MAVOEAXattrRemove(object.c_str(), "com.apple.ResourceFork"));
        EXPECT_EQ(6, looked) << "each gives the execute bit and takes it away";
        EXPECT_EQ(kUser, geteuid());
        InThread([] { EXPECT_EQ(kUser, geteuid()); });
    });
}

// ---- Locks --------------------------------------------------------------------------------------

// Promise: "THREADS: They share the effective user id"
// Promise: "LOCKS: *MAVOEASOpen*(3) sets a record lock"
// Promise: "LOCKS: It does not keep threads"
TEST_F(ThreadsTest, ALockKeepsOtherProcessesOutAndNoThread) {
    const Descriptor file(stream_);
    EASHandle* const h = MAVOEASOpen(file.get(), F_WRLCK);
    ASSERT_NE(nullptr, h);
    const pid_t self = getpid();
    InChild([&] {
        const Descriptor own(stream_);
        EXPECT_EQ(self, LockedBy(own.get()));
        EXPECT_EQ(nullptr, MAVOEASOpen(own.get(), F_RDLCK));
        EXPECT_EQ(MAVOEA_ERR_LOCK, MLIBCErrGet());
    });
    const Descriptor others(stream_);
    InThread([&] {
        EASHandle* const second = MAVOEASOpen(others.get(), F_WRLCK);
        ASSERT_NE(nullptr, second);
        EXPECT_EQ(0, MAVOEASClose(second));
    });
    // The kernel has one lock for both handles.
    InChild([&] { EXPECT_EQ(0, LockedBy(others.get())); });
    EXPECT_EQ(0, MAVOEASClose(h));
}

// Promise: "LOCKS: Closing any descriptor"
TEST_F(ThreadsTest, ClosingAnyDescriptorDropsTheLock) {
    const Descriptor file(stream_);
    EASHandle* const h = MAVOEASOpen(file.get(), F_WRLCK);
    ASSERT_NE(nullptr, h);
    InThread([&] { const Descriptor another(stream_); });
    InChild([&] { EXPECT_EQ(0, LockedBy(file.get())); });
    EXPECT_EQ(0, MAVOEASClose(h));
}

// ---- Children -----------------------------------------------------------------------------------

// Promise: "FORK: A child does not inherit record locks"
// Promise: "FORK: What it closes takes none"
TEST_F(ThreadsTest, AChildHasNoLockAndTakesNoneAway) {
    const Descriptor file(stream_);
    EASHandle* const h = MAVOEASOpen(file.get(), F_WRLCK);
    ASSERT_NE(nullptr, h);
    const pid_t self = getpid();
    InChild([&] {
        EXPECT_EQ(self, LockedBy(file.get()));
        EXPECT_EQ(-1, MAVOEASLockSet(h, F_WRLCK));
        EXPECT_EQ(MAVOEA_ERR_LOCK, MLIBCErrGet());
        EXPECT_EQ(0, MAVOEASClose(h));
        close(file.get());
    });
    InChild([&] { EXPECT_EQ(self, LockedBy(file.get())); });
    EXPECT_EQ(0, MAVOEASClose(h));
}

class ProgramsTest : public ThreadsTest {
 protected:
    void SetUp() override {
        WriteFile(from_, {});
        WriteFile(to_, {});
        programs.clear();
    }

    int Copy(int type, int move, int (*copy_fn)(const char*, const char*)) {
        return MAVOEACopyEx(from_.c_str(), to_.data(), move, 1, type, type, 0, 0, copy_fn);
    }

    std::string from_ = dir_ / "from";
    std::string to_ = dir_ / "to";
};

// Promise: "FORK: *MAVOEACopy*(3), *MAVOEACopyEx*(3)"
TEST_F(ProgramsTest, CopyingRunsPrograms) {
    WriteFile(dir_ / "._from", {});
    EXPECT_EQ(0, MAVOEACopy(from_.c_str(), to_.data(), 0, 0, 0, 0, 0, 0));
    EXPECT_THAT(programs, ElementsAre("/bin/cp"));
    EXPECT_TRUE(Exists(dir_ / "._to")) << "it is waited for";
}

// Promise: "FORK: *MAVOEACopy*(3), *MAVOEACopyEx*(3)"
TEST_F(ProgramsTest, MovingRunsProgramsWithACopyFunctionToo) {
    if (!RunsAsRoot()) GTEST_SKIP() << "takes the superuser, to make an EA directory";
    for (const auto function : {&rename, static_cast<decltype(&rename)>(nullptr)}) {
        SCOPED_TRACE(function == nullptr ? "without" : "with");
        programs.clear();
        std::filesystem::remove_all(dir_ / "@eaDir");
        mkdir((dir_ / "@eaDir").c_str(), 0777);
        mkdir((dir_ / "@eaDir/from").c_str(), 0777);
        WriteFile(dir_ / "@eaDir/from/MAVO:Other", Ascii("value"));
        EXPECT_EQ(0, Copy(1, 1, function));
        EXPECT_EQ(Ascii("value"), ReadFile(dir_ / "@eaDir/to/MAVO:Other"));
        EXPECT_THAT(programs, Contains("/bin/rm"));
        if (function == nullptr) {
            EXPECT_THAT(programs, Contains("/bin/mv"));
        }
    }
}

// Promise: "FORK: *MAVOEACopy*(3), *MAVOEACopyEx*(3)"
TEST_F(ProgramsTest, RenamingToAnotherVolumeRunsAProgram) {
    if (!RunsAsRoot()) GTEST_SKIP() << "takes the superuser, to make an EA directory";
    const SecondVolume second;
    if (!second.ok()) GTEST_SKIP() << "there is no second volume";
    mkdir((dir_ / "@eaDir").c_str(), 0777);
    WriteFile(dir_ / "@eaDir/from@MavoEAStream", Ascii("stream"));
    EXPECT_EQ(0, MAVOEARename(from_.c_str(), (second.path() + "/to").c_str(), 1, nullptr));
    EXPECT_THAT(programs, ElementsAre("/bin/mv"));
    EXPECT_EQ(Ascii("stream"), ReadFile(second.path() + "/@eaDir/to@MavoEAStream"));
}

// Promise: "FORK: *MAVOEACopy*(3), *MAVOEACopyEx*(3)"
TEST_F(ProgramsTest, RemovingADanglingEaDirectoryRunsAProgram) {
    mkdir((dir_ / "dir").c_str(), 0777);
    mkdir((dir_ / "dir/@eaDir").c_str(), 0777);
    MAVOEARemoveDanglingEADir((dir_ / "dir").c_str());
    EXPECT_THAT(programs, ElementsAre("/bin/rm"));
    EXPECT_THAT(NamesIn(dir_ / "dir"), ElementsAre());
}

// Promise: "FORK: *MAVOEAUpgrade*(3) and *MAVOEAOpen*(3)"
TEST_F(ProgramsTest, ConvertingOtherReservedFilesRunsAProgram) {
    mkdir((dir_ / "@eaDir").c_str(), 0777);
    mkdir((dir_ / "@eaDir/from").c_str(), 0777);
    WriteFile(dir_ / "@eaDir/from/MAVO:Other", {});
    EXPECT_EQ(0, MAVOEAUpgrade(from_.c_str(), "MAVO:Other"));
    EXPECT_THAT(programs, ElementsAre("/bin/mv"));

    programs.clear();
    WriteFile(dir_ / "@eaDir/from/MAVO:More", {});
    EXPECT_EQ(-1, MAVOEAOpen(EA_FORM_FILE, from_.c_str(), "MAVO:More", O_RDONLY, EA_PLACE_EADIR));
    EXPECT_THAT(programs, ElementsAre("/bin/mv"));
}

// Sets a signal's action until the end of its scope.
class Action {
 public:
    Action(int signal, void (*handler)(int)) : signal_(signal) {
        struct sigaction action = {};
        action.sa_handler = handler;
        sigaction(signal, &action, &former_);
    }
    ~Action() { sigaction(signal_, &former_, nullptr); }
    Action(const Action&) = delete;
    Action& operator=(const Action&) = delete;

 private:
    int signal_;
    struct sigaction former_;
};

// Promise: "FORK: A process that ignores SIGCHLD"
TEST_F(ProgramsTest, WhereSigchldIsIgnoredWhatHasBeenDoneMayCountAsFailed) {
    WriteFile(dir_ / "._from", Ascii("metadata"));
    const Action ignored(SIGCHLD, SIG_IGN);
    EXPECT_EQ(-1, MAVOEACopy(from_.c_str(), to_.data(), 0, 0, 0, 0, 0, 0));
    EXPECT_EQ(Ascii("metadata"), ReadFile(dir_ / "._to"));
}

// ---- Signals ------------------------------------------------------------------------------------

void Ignore(int /*signal*/) {}

// Of each signal, what it does and whether it is blocked.
std::string Signals() {
    std::string all;
    sigset_t blocked;
    sigemptyset(&blocked);
    pthread_sigmask(SIG_SETMASK, nullptr, &blocked);
    for (int signal = 1; signal < NSIG; ++signal) {
        struct sigaction action = {};
        if (sigaction(signal, nullptr, &action) != 0) continue;  // the C library's own
        const char does = action.sa_handler == SIG_DFL   ? 'd'
                          : action.sa_handler == SIG_IGN ? 'i'
                                                         : 'h';
        all += std::to_string(signal) + does + (sigismember(&blocked, signal) == 1 ? "b " : " ");
    }
    return all;
}

// Promise: "SIGNALS: The host's libraries change no signal's action"
TEST_F(ProgramsTest, NoCallChangesSignals) {
    const Action caught(SIGUSR1, Ignore);
    const Action ignored(SIGPIPE, SIG_IGN);
    sigset_t block;
    sigset_t former;
    sigemptyset(&block);
    sigaddset(&block, SIGUSR2);
    pthread_sigmask(SIG_BLOCK, &block, &former);
    const std::string before = Signals();
    int looked = 0;
    meanwhile = [&] {
        ++looked;
        EXPECT_EQ(before, Signals());
    };

    mkdir((dir_ / "@eaDir").c_str(), 0777);
    MAVOEAMKDir(1, (dir_ / "@eaDir/from").c_str());  // done by the superuser only
    const int fd = open((dir_ / "@eaDir/from@MavoEAStream").c_str(), O_RDWR | O_CREAT, 0666);
    EASHandle* const h = MAVOEASOpen(fd, F_WRLCK);
    ASSERT_NE(nullptr, h);
    EXPECT_EQ(3, MAVOEASWrite(h, "colour", "red", 3, 0, 0));
    EXPECT_EQ(0, MAVOEASClose(h));
    close(fd);
    char byte = 0;
    EXPECT_EQ(-1, MAVOEAXattrSet(from_.c_str(), "com.apple.ResourceFork", &byte, 1, 0));
    EXPECT_EQ(0, Copy(1, 0, nullptr));
    EXPECT_EQ(0, MAVOEARename(to_.c_str(), (dir_ / "moved").c_str(), 1, nullptr));
    EXPECT_EQ(0, MAVOEARemove((dir_ / "moved").c_str(), 1, nullptr));
    EXPECT_THAT(programs, Not(ElementsAre()));
    EXPECT_LT(0, looked);

    EXPECT_EQ(before, Signals());
    pthread_sigmask(SIG_SETMASK, &former, nullptr);
}

// ---- The error stack, as libmavoea-errors(7) has it ---------------------------------------------

TEST_F(ThreadsTest, ARecordOfCode0TellsAnOldOneFromNone) {
    const std::string object = dir_ / "object";
    EXPECT_EQ(-1, MAVOEASFlush(nullptr));
    EXPECT_EQ(MAVOEA_ERR_BAD_ARGUMENT, MLIBCErrGet());
    errno = 0;
    EXPECT_EQ(-1, MAVOEAOpen(1, object.c_str(), MAVOEA_KIND_STREAM, O_RDONLY, EA_PLACE_EADIR));
    EXPECT_EQ(MAVOEA_ERR_BAD_ARGUMENT, MLIBCErrGet()) << "the old one";

    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    EXPECT_EQ(-1, MAVOEAOpen(1, object.c_str(), MAVOEA_KIND_STREAM, O_RDONLY, EA_PLACE_EADIR));
    EXPECT_EQ(0, MLIBCErrGet());
    EXPECT_EQ(ENOENT, errno);
}

}  // namespace
}  // namespace mavoea::test

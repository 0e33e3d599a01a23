// Programs run for their exit status, and what the caller keeps meanwhile.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "platform/include/mavocore.h"
#include "tests/platform/support/allocation_control.h"
#include "tests/support/emulator.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

constexpr char kShell[] = "/bin/sh";

// Runs a script, which finds `argument` as $0.
int Script(const char* text, const std::string& argument = "sh") {
    return MLIBCExec(kShell, "-c", text, argument.c_str(), static_cast<char*>(nullptr));
}

std::string TextOf(const std::string& path) {
    const Bytes bytes = ReadFile(path);
    return std::string(bytes.begin(), bytes.end());
}

// Sets a signal's disposition for the scope of a test.
class Disposition {
 public:
    Disposition(int signal, void (*handler)(int), int flags = 0) : signal_(signal) {
        struct sigaction action = {};
        action.sa_handler = handler;
        action.sa_flags = flags;
        sigaction(signal, &action, &before_);
    }
    ~Disposition() { sigaction(signal_, &before_, nullptr); }
    Disposition(const Disposition&) = delete;
    Disposition& operator=(const Disposition&) = delete;

 private:
    int signal_;
    struct sigaction before_;
};

volatile sig_atomic_t signals_taken = 0;
void CountSignal(int) { signals_taken = signals_taken + 1; }

// Blocked, ignored and caught signals: signal n is bit n - 1. Those above 31 are left out, since
// the C library keeps some of them for itself.
std::map<std::string, unsigned long long> SignalMasks(std::istream&& in) {
    std::map<std::string, unsigned long long> masks;
    for (std::string line; std::getline(in, line);) {
        const std::string name = line.substr(0, line.find(':'));
        if (name == "SigBlk" || name == "SigIgn" || name == "SigCgt") {
            masks[name] = std::stoull(line.substr(line.find(':') + 1), nullptr, 16) & 0x7FFFFFFF;
        }
    }
    return masks;
}

std::vector<std::string> OpenDescriptors() {
    std::vector<std::string> descriptors;
    for (int fd = 0; fd < 256; ++fd) {
        const int flags = fcntl(fd, F_GETFD);
        if (flags >= 0) descriptors.push_back(std::to_string(fd) + ":" + std::to_string(flags));
    }
    return descriptors;
}

TEST(ExecTest, TheExitStatusIsReturned) {
    EXPECT_EQ(0, Script("exit 0"));
    EXPECT_EQ(1, Script("exit 1"));
    EXPECT_EQ(127, Script("exit 127"));
    EXPECT_EQ(255, Script("exit 255"));
}

TEST(ExecTest, AProgramThatASignalKilledIsNegativeAndTellsTheSignal) {
    EXPECT_EQ(-128 - SIGKILL, Script("kill -KILL $$"));
    EXPECT_EQ(-128 - SIGHUP,
              Script("kill -HUP $$"));  // its number is 1, and -1 means another thing
}

TEST(ExecTest, WhatCannotBeRunIsMinus1WithErrno) {
    MAVOEA_SKIP_IN_EMULATOR(kNoSpawnErrors);
    errno = 0;
    EXPECT_EQ(-1, MLIBCExec("/nowhere/to/be/found", static_cast<char*>(nullptr)));
    EXPECT_EQ(ENOENT, errno);

    const TempDir dir;
    WriteFile(dir / "plain", Ascii("#!/bin/sh\n"));
    errno = 0;
    EXPECT_EQ(-1, MLIBCExec((dir / "plain").c_str(), static_cast<char*>(nullptr)));
    EXPECT_EQ(EACCES, errno);
}

TEST(ExecTest, NoProgramIsMinus1WithEinval) {
    errno = 0;
    EXPECT_EQ(-1, MLIBCExec(nullptr, static_cast<char*>(nullptr)));
    EXPECT_EQ(EINVAL, errno);
}

TEST(ExecTest, ThePathIsNotSearched) {
    MAVOEA_SKIP_IN_EMULATOR(kNoSpawnErrors);
    errno = 0;
    EXPECT_EQ(-1, MLIBCExec("true", static_cast<char*>(nullptr)));
    EXPECT_EQ(ENOENT, errno);
}

TEST(ExecTest, ArgumentsArriveAsTheyAreWithoutAShell) {
    const TempDir dir;
    const std::string out = dir / "out";
    ASSERT_EQ(0, MLIBCExec(kShell, "-c", "printf '[%s]' \"$@\" >\"$0\"", out.c_str(), "a b", "",
                           "$HOME", "*", ";exit 3", "'\"\\", static_cast<char*>(nullptr)));
    EXPECT_EQ("[a b][][$HOME][*][;exit 3]['\"\\]", TextOf(out));
}

// Promise: "FORK: The program inherits the environment"
TEST(ExecTest, TheProgramGetsTheEnvironment) {
    ASSERT_EQ(0, setenv("MAVOEA_EXEC_TEST", "as it is", 1));
    const int result = Script("test \"$MAVOEA_EXEC_TEST\" = 'as it is'");
    unsetenv("MAVOEA_EXEC_TEST");
    EXPECT_EQ(0, result);
}

TEST(ExecTest, TheProgramsNameIsItsFirstArgument) {
    const TempDir dir;
    const std::string out = dir / "out";
    ASSERT_EQ(0, symlink(kShell, (dir / "link").c_str()) == 0
                     ? MLIBCExec((dir / "link").c_str(), "-c",
                                 ("tr '\\0' '\\n' </proc/$$/cmdline | head -n 1 >" + out).c_str(),
                                 static_cast<char*>(nullptr))
                     : 1);
    EXPECT_EQ((dir / "link") + "\n", TextOf(out));
}

// Promise: "SIGNALS: The host's libraries change no signal's action"
TEST(ExecTest, TheCallersSignalsStayAsTheyAreMeanwhile) {
    const Disposition ignored(SIGPIPE, SIG_IGN);
    const Disposition caught(SIGUSR1, CountSignal);
    const TempDir dir;
    const std::string out = dir / "out";
    const auto before = SignalMasks(std::ifstream("/proc/thread-self/status"));
    ASSERT_EQ(3u, before.size());
    // The script looks once its parent waits for it.
    ASSERT_EQ(0, Script("while ! grep -q '^State:.S' /proc/$PPID/status; do :; done;"
                        "cat /proc/$PPID/status >\"$0\"",
                        out));
    EXPECT_EQ(before, SignalMasks(std::ifstream(out)));
    EXPECT_EQ(before, SignalMasks(std::ifstream("/proc/thread-self/status")));
}

// Promise: "FORK: The program inherits the environment"
TEST(ExecTest, TheProgramGetsTheSignalMaskAndTheIgnoredSignals) {
    const Disposition ignored(SIGPIPE, SIG_IGN);
    const Disposition caught(SIGUSR1, CountSignal);
    sigset_t block, before;
    sigemptyset(&block);
    sigaddset(&block, SIGUSR2);
    sigprocmask(SIG_BLOCK, &block, &before);
    const TempDir dir;
    const std::string out = dir / "out";
    auto own = SignalMasks(std::ifstream("/proc/thread-self/status"));
    const int result =
        MLIBCExec("/bin/cp", "/proc/self/status", out.c_str(), static_cast<char*>(nullptr));
    sigprocmask(SIG_SETMASK, &before, nullptr);
    ASSERT_EQ(0, result);
    auto its = SignalMasks(std::ifstream(out));
    EXPECT_EQ(own["SigBlk"], its["SigBlk"]);
    EXPECT_EQ(own["SigIgn"], its["SigIgn"]);
}

// Promise: "FORK: The program inherits the environment"
TEST(ExecTest, TheCallersDescriptorsStayAsTheyAre) {
    const int kept = open("/dev/null", O_RDONLY | O_CLOEXEC);
    const int handed_on = open("/dev/null", O_RDONLY);
    const auto before = OpenDescriptors();
    EXPECT_EQ(0, Script("exit 0"));
    EXPECT_NE(0, MLIBCExec("/nowhere", static_cast<char*>(nullptr)));
    EXPECT_EQ(before, OpenDescriptors());
    EXPECT_EQ(1, Script("test -e /proc/$$/fd/$0", std::to_string(kept)));
    EXPECT_EQ(0, Script("test -e /proc/$$/fd/$0", std::to_string(handed_on)));
    close(kept);
    close(handed_on);
}

TEST(ExecTest, AnInterruptedWaitGoesOn) {
    const Disposition caught(SIGUSR1, CountSignal);  // without SA_RESTART
    signals_taken = 0;
    EXPECT_EQ(7, Script("while ! grep -q '^State:.S' /proc/$PPID/status; do :; done;"
                        "kill -USR1 $PPID; exit 7"));
    EXPECT_EQ(1, signals_taken);
}

TEST(ExecTest, OtherChildrenAreLeftToTheirParent) {
    const pid_t other = fork();
    if (other == 0) _exit(9);
    siginfo_t info;
    ASSERT_EQ(0, waitid(P_PID, static_cast<id_t>(other), &info, WEXITED | WNOWAIT));
    EXPECT_EQ(3, Script("exit 3"));
    int status = 0;
    EXPECT_EQ(other, waitpid(other, &status, 0));
    EXPECT_EQ(9, WEXITSTATUS(status));
    EXPECT_EQ(-1, waitpid(-1, &status, 0)) << "no child is left behind";
    EXPECT_EQ(ECHILD, errno);
}

// Promise: "FORK: A process that ignores SIGCHLD"
TEST(ExecTest, WhereSigchldIsIgnoredTheProgramRunsAndItsStatusIsLost) {
    const TempDir dir;
    const std::string out = dir / "out";
    const Disposition ignored(SIGCHLD, SIG_IGN);
    EXPECT_EQ(-2, Script("echo done >\"$0\"", out));
    EXPECT_EQ("done\n", TextOf(out)) << "the wait ends with the program";
}

TEST(ExecTest, EveryAllocationThatFailsIsReported) {
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        FailNthAllocation fault(nth);
        errno = 0;
        const int result = MLIBCExec("/bin/true", "a", static_cast<char*>(nullptr));
        if (!fault.fired()) {
            EXPECT_EQ(0, result);
            break;
        }
        EXPECT_EQ(-1, result);
        EXPECT_EQ(ENOMEM, errno);
    }
}

}  // namespace
}  // namespace mavoea::test

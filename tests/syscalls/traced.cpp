#include "tests/syscalls/traced.h"

#include <errno.h>
#include <signal.h>
#include <string.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdint>
#include <map>

namespace mavoea::test {
namespace {

// The child's exit status.
enum { kSucceeded = 0, kFailed = 1, kNotTraced = 2 };

// A call that the library has no use for: it stands before and behind the traced code.
constexpr long kMark = SYS_getppid;

// What distinguishes a stop at a system call from one at a trap.
constexpr int kSystemCallStop = SIGTRAP | 0x80;

std::string NameOf(std::uint64_t number) {
    static const std::map<std::uint64_t, std::string> names = {
#ifdef SYS_open
        {SYS_open, "open"},
#endif
#ifdef SYS_fstat64
        {SYS_fstat64, "fstat"},
#endif
#ifdef SYS_fstatat64
        {SYS_fstatat64, "fstatat"},
#endif
#ifdef SYS_newfstatat
        {SYS_newfstatat, "fstatat"},
#endif
#ifdef SYS_fcntl64
        {SYS_fcntl64, "fcntl"},
#endif
#ifdef SYS__llseek
        {SYS__llseek, "lseek"},
#endif
#ifdef SYS_ftruncate64
        {SYS_ftruncate64, "ftruncate"},
#endif
#ifdef SYS_mmap
        {SYS_mmap, "mmap"},
#endif
#ifdef SYS_mmap2
        {SYS_mmap2, "mmap"},
#endif
        {SYS_brk, "brk"},
        {SYS_close, "close"},
        {SYS_fcntl, "fcntl"},
        {SYS_fdatasync, "fdatasync"},
        {SYS_fstat, "fstat"},
        {SYS_fsync, "fsync"},
        {SYS_ftruncate, "ftruncate"},
        {SYS_geteuid, "geteuid"},
        {SYS_getpid, "getpid"},
        {SYS_lseek, "lseek"},
        {SYS_munmap, "munmap"},
        {SYS_openat, "open"},
        {SYS_pread64, "pread"},
        {SYS_preadv, "preadv"},
        {SYS_pwrite64, "pwrite"},
        {SYS_pwritev, "pwritev"},
        {SYS_read, "read"},
        {SYS_readv, "readv"},
        {SYS_statx, "statx"},
        {SYS_sync, "sync"},
        {SYS_write, "write"},
        {SYS_writev, "writev"},
    };
    const auto found = names.find(number);
    return found == names.end() ? "call " + std::to_string(number) : found->second;
}

[[noreturn]] void RunChild(const std::function<bool()>& code) {
    if (!code()) _exit(kFailed);
    if (ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0) _exit(kNotTraced);
    raise(SIGSTOP);
    syscall(kMark);
    const bool succeeded = code();
    syscall(kMark);
    _exit(succeeded ? kSucceeded : kFailed);
}

// Waits until the child stops or ends; false once it has ended.
bool WaitForStop(pid_t child, int* status) {
    return waitpid(child, status, 0) == child && WIFSTOPPED(*status);
}

// The number of the call that the child is about to make; nothing when it has just made one, or
// the kernel does not say.
std::optional<std::uint64_t> CallBegun(pid_t child) {
    __ptrace_syscall_info info;
    if (ptrace(PTRACE_GET_SYSCALL_INFO, child, sizeof info, &info) <= 0) return std::nullopt;
    if (info.op != PTRACE_SYSCALL_INFO_ENTRY) return std::nullopt;
    return info.entry.nr;
}

// Lets a child that has stopped itself run on to its end, and lists its calls between the marks.
void Follow(pid_t child, Trace* trace, int* status) {
    int marks = 0;
    int signal = 0;
    ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL);
    while (ptrace(PTRACE_SYSCALL, child, nullptr, signal) == 0 && WaitForStop(child, status)) {
        signal = 0;
        if (WSTOPSIG(*status) != kSystemCallStop) {
            signal = WSTOPSIG(*status);
        } else if (const auto number = CallBegun(child)) {
            if (*number == std::uint64_t{kMark}) {
                ++marks;
            } else if (marks == 1) {
                trace->calls.push_back(NameOf(*number));
            }
        }
    }
    // With other marks than two the list is not to be believed.
    trace->succeeded = marks == 2 && WIFEXITED(*status) && WEXITSTATUS(*status) == kSucceeded;
}

}  // namespace

std::optional<Trace> TraceCalls(const std::function<bool()>& code, std::string* why_not) {
    const pid_t child = fork();
    if (child == 0) RunChild(code);
    int status = 0;
    Trace trace;
    if (child < 0) {
        *why_not = std::string("fork: ") + strerror(errno);
        return std::nullopt;
    }
    if (WaitForStop(child, &status)) {
        Follow(child, &trace, &status);
    } else if (WIFEXITED(status) && WEXITSTATUS(status) == kNotTraced) {
        *why_not = "processes may not be traced here";
        return std::nullopt;
    }
    return trace;
}

}  // namespace mavoea::test

#include "tests/tool/stopped_tool.h"

#include <errno.h>
#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sched.h>
#include <signal.h>
#include <stddef.h>
#include <string.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <iterator>
#include <map>
#include <set>

namespace mavoea::test {
namespace {

// ---- The calls ----------------------------------------------------------------------------------

// Where a call has its paths. Arguments count from 0.
enum class Shape {
    kPath,        // 0
    kTwoPaths,    // 0 and 1
    kSecondPath,  // 1; what 0 points to is text
    kAt,          // 0 a directory, 1 in it
    kTwoAt,       // 0 and 1, 2 and 3
    kSecondAt,    // 1 and 2; what 0 points to is text
    kDescriptor,  // 0, an open file
    kListing,     // 0, an open directory whose names it reads
    kData,        // 0, an open file whose data it reads or writes
    kSync,        // 0, an open file
    kLock,        // 0, an open file
};

struct Call {
    const char* name;
    Shape shape;
};

const std::map<std::uint64_t, Call>& Calls() {
    static const std::map<std::uint64_t, Call> calls = {
#define MAVOEA_CALL(name, shape) std::pair(SYS_##name, Call{#name, Shape::shape})
#ifdef SYS_open
        MAVOEA_CALL(open, kPath),
        MAVOEA_CALL(creat, kPath),
        MAVOEA_CALL(stat, kPath),
        MAVOEA_CALL(lstat, kPath),
        MAVOEA_CALL(access, kPath),
        MAVOEA_CALL(mkdir, kPath),
        MAVOEA_CALL(rmdir, kPath),
        MAVOEA_CALL(unlink, kPath),
        MAVOEA_CALL(mknod, kPath),
        MAVOEA_CALL(rename, kTwoPaths),
        MAVOEA_CALL(link, kTwoPaths),
        MAVOEA_CALL(symlink, kSecondPath),
        MAVOEA_CALL(readlink, kPath),
        MAVOEA_CALL(chmod, kPath),
        MAVOEA_CALL(chown, kPath),
        MAVOEA_CALL(lchown, kPath),
        MAVOEA_CALL(utime, kPath),
        MAVOEA_CALL(utimes, kPath),
        MAVOEA_CALL(futimesat, kAt),
        MAVOEA_CALL(getdents, kListing),
#endif
#ifdef SYS_stat64
        MAVOEA_CALL(stat64, kPath),
        MAVOEA_CALL(lstat64, kPath),
#endif
#ifdef SYS_newfstatat
        MAVOEA_CALL(newfstatat, kAt),
#endif
#ifdef SYS_fstatat64
        MAVOEA_CALL(fstatat64, kAt),
#endif
#ifdef SYS_truncate64
        MAVOEA_CALL(truncate64, kPath),
        MAVOEA_CALL(ftruncate64, kDescriptor),
#endif
#ifdef SYS_utimensat_time64
        MAVOEA_CALL(utimensat_time64, kAt),
#endif
#ifdef SYS_statfs64
        MAVOEA_CALL(statfs64, kPath),
#endif
#ifdef SYS_renameat
        MAVOEA_CALL(renameat, kTwoAt),
#endif
#ifdef SYS_openat2
        MAVOEA_CALL(openat2, kAt),
        MAVOEA_CALL(faccessat2, kAt),
#endif
        MAVOEA_CALL(chdir, kPath),
        MAVOEA_CALL(execve, kPath),
        MAVOEA_CALL(execveat, kAt),
        MAVOEA_CALL(faccessat, kAt),
        MAVOEA_CALL(fchdir, kDescriptor),
        MAVOEA_CALL(fchmod, kDescriptor),
        MAVOEA_CALL(fchmodat, kAt),
        MAVOEA_CALL(fchown, kDescriptor),
        MAVOEA_CALL(fchownat, kAt),
        MAVOEA_CALL(fgetxattr, kDescriptor),
        MAVOEA_CALL(flistxattr, kDescriptor),
        MAVOEA_CALL(fremovexattr, kDescriptor),
        MAVOEA_CALL(fsetxattr, kDescriptor),
        MAVOEA_CALL(ftruncate, kDescriptor),
        MAVOEA_CALL(getdents64, kListing),
        MAVOEA_CALL(getxattr, kPath),
        MAVOEA_CALL(lgetxattr, kPath),
        MAVOEA_CALL(linkat, kTwoAt),
        MAVOEA_CALL(listxattr, kPath),
        MAVOEA_CALL(llistxattr, kPath),
        MAVOEA_CALL(lremovexattr, kPath),
        MAVOEA_CALL(lsetxattr, kPath),
        MAVOEA_CALL(mkdirat, kAt),
        MAVOEA_CALL(mknodat, kAt),
        MAVOEA_CALL(name_to_handle_at, kAt),
        MAVOEA_CALL(openat, kAt),
        MAVOEA_CALL(readlinkat, kAt),
        MAVOEA_CALL(removexattr, kPath),
        MAVOEA_CALL(renameat2, kTwoAt),
        MAVOEA_CALL(setxattr, kPath),
        MAVOEA_CALL(statfs, kPath),
        MAVOEA_CALL(statx, kAt),
        MAVOEA_CALL(symlinkat, kSecondAt),
        MAVOEA_CALL(truncate, kPath),
        MAVOEA_CALL(unlinkat, kAt),
        MAVOEA_CALL(utimensat, kAt),
        MAVOEA_CALL(copy_file_range, kData),
        MAVOEA_CALL(pread64, kData),
        MAVOEA_CALL(pwrite64, kData),
        MAVOEA_CALL(fsync, kSync),
        MAVOEA_CALL(fdatasync, kSync),
        MAVOEA_CALL(syncfs, kSync),
        MAVOEA_CALL(fcntl, kLock),
#undef MAVOEA_CALL
        // The headers may not know these yet; their numbers are the same everywhere.
        {452, {"fchmodat2", Shape::kAt}},
        {463, {"setxattrat", Shape::kAt}},
        {464, {"getxattrat", Shape::kAt}},
        {465, {"listxattrat", Shape::kAt}},
        {466, {"removexattrat", Shape::kAt}},
    };
    return calls;
}

// Calls of Calls() that may be asked for the status of an open file, which names nothing and
// changes nothing: the number, and the argument that has AT_EMPTY_PATH then.
struct StatusCall {
    std::uint32_t number;
    std::uint32_t flags;
};
constexpr StatusCall kStatusCalls[] = {
#ifdef SYS_newfstatat
    {SYS_newfstatat, 3},
#endif
#ifdef SYS_fstatat64
    {SYS_fstatat64, 3},
#endif
    {SYS_statx, 2},
};

// A program for the kernel that stops a process at those calls and at no others, which takes a
// fraction of the time of stopping it at all of them.
class StopAtCalls {
 public:
    explicit StopAtCalls(Stops stops) {
        std::vector<std::uint32_t> numbers;
        for (const auto& [number, call] : Calls()) {
            if (stops == Stops::kAtNames && call.shape == Shape::kData) continue;
            if (stops != Stops::kAtSyncsToo && call.shape == Shape::kSync) continue;
            if (stops != Stops::kAtLocksToo && call.shape == Shape::kLock) continue;
            numbers.push_back(static_cast<std::uint32_t>(number));
        }
        const std::size_t allow = 1 + 3 * std::size(kStatusCalls) + numbers.size();
        const std::size_t trace = allow + 1;
        const auto to = [this](std::size_t line) {
            return static_cast<std::uint8_t>(line - program_.size() - 1);
        };
        program_.push_back(BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)));
        for (const StatusCall& call : kStatusCalls) {
            constexpr std::size_t kArgument = sizeof(seccomp_data::args[0]);
            constexpr std::size_t kLowHalf = std::endian::native == std::endian::big ? 4 : 0;
            const auto flags = static_cast<std::uint32_t>(offsetof(seccomp_data, args) +
                                                          call.flags * kArgument + kLowHalf);
            program_.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, call.number, 0, 2));
            program_.push_back(BPF_STMT(BPF_LD | BPF_W | BPF_ABS, flags));
            program_.push_back(
                BPF_JUMP(BPF_JMP | BPF_JSET | BPF_K, AT_EMPTY_PATH, to(allow), to(trace)));
        }
        for (const std::uint32_t number : numbers) {
            program_.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, number, to(trace), 0));
        }
        program_.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW));
        program_.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_TRACE));
    }

    // From here on this process stops, and so do those that it makes. Allocates nothing.
    bool Begin() {
        const sock_fprog filter = {static_cast<unsigned short>(program_.size()), program_.data()};
        return prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
               prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &filter) == 0;
    }

 private:
    std::vector<sock_filter> program_;
};

// ---- What a stopped process names ---------------------------------------------------------------

std::string LinkTarget(const std::string& link) {
    std::string target(4096, '\0');
    const ssize_t size = readlink(link.c_str(), target.data(), target.size());
    target.resize(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
    return target;
}

// The text at that address of the process; empty where there is none.
std::string TextAt(pid_t process, std::uint64_t address) {
    constexpr std::uint64_t kPage = 4096;
    std::string text;
    while (address != 0 && text.size() < kPage) {
        char part[kPage];
        const std::size_t size = kPage - address % kPage;
        iovec here = {part, size};
        iovec there = {reinterpret_cast<void*>(static_cast<std::uintptr_t>(address)), size};
        const ssize_t got = process_vm_readv(process, &here, 1, &there, 1, 0);
        if (got <= 0) return {};
        const std::size_t length = strnlen(part, static_cast<std::size_t>(got));
        text.append(part, length);
        if (length < static_cast<std::size_t>(got)) break;
        address += length;
    }
    return text;
}

std::string DescriptorPath(pid_t process, std::uint64_t descriptor) {
    const std::string of = "/proc/" + std::to_string(process);
    const int fd = static_cast<int>(descriptor);
    return fd == AT_FDCWD ? of + "/cwd" : of + "/fd/" + std::to_string(fd);
}

std::string DescriptorFile(pid_t process, std::uint64_t descriptor) {
    return LinkTarget(DescriptorPath(process, descriptor));
}

std::string Tidy(const std::string& path) {
    std::string tidy;
    for (const char c : path) {
        if (c != '/' || tidy.empty() || tidy.back() != '/') tidy += c;
    }
    for (std::size_t at; (at = tidy.find("/./")) != std::string::npos;) tidy.erase(at, 2);
    if (tidy.ends_with("/.")) tidy.erase(tidy.size() - 2);
    while (tidy.size() > 1 && tidy.back() == '/') tidy.pop_back();
    return tidy;
}

bool IsIn(const std::string& path, const std::string& directory) {
    return path == directory || directory == "/" || path.starts_with(directory + '/');
}

// ---- The run ------------------------------------------------------------------------------------

class Tracer {
 public:
    Tracer(pid_t tool, const std::string& tree, const AtCall& at_call)
        : tool_(tool), tree_(tree), at_call_(at_call) {}

    // Lets the tool, which has stopped itself, run to its end; its wait status.
    int Follow() {
        ptrace(PTRACE_SETOPTIONS, tool_, nullptr, kOptions);
        ptrace(PTRACE_CONT, tool_, nullptr, 0);
        running_.insert(tool_);
        int result = 0;
        while (!running_.empty() || !expected_.empty()) {
            int status = 0;
            const pid_t process = waitpid(-1, &status, __WALL);
            if (process < 0) break;
            if (WIFSTOPPED(status)) {
                ptrace(PTRACE_CONT, process, nullptr, Stopped(process, status));
            } else {
                running_.erase(process);
                expected_.erase(process);
                if (process == tool_) result = status;
            }
        }
        return result;
    }

    int calls() const { return call_.nth; }

 private:
    static constexpr long kOptions = PTRACE_O_TRACESECCOMP | PTRACE_O_EXITKILL |
                                     PTRACE_O_TRACEEXEC | PTRACE_O_TRACEFORK | PTRACE_O_TRACEVFORK |
                                     PTRACE_O_TRACECLONE;

    // The signal that the process goes on with.
    int Stopped(pid_t process, int status) {
        if (running_.insert(process).second) {  // a new one, which begins with a stop
            expected_.erase(process);
            return 0;
        }
        const int event = status >> 16;
        if (event == 0) return WSTOPSIG(status);
        if (event == PTRACE_EVENT_SECCOMP) {
            AtSystemCall(process);
        } else if (event != PTRACE_EVENT_EXEC) {
            unsigned long child = 0;
            ptrace(PTRACE_GETEVENTMSG, process, nullptr, &child);
            if (!running_.contains(static_cast<pid_t>(child))) {
                expected_.insert(static_cast<pid_t>(child));
            }
        }
        return 0;
    }

    void AtSystemCall(pid_t process) {
        if (!watching_) {
            // Where the kernel can, it stops at no more calls.
            ptrace(PTRACE_SETOPTIONS, process, nullptr, kOptions | PTRACE_O_SUSPEND_SECCOMP);
            return;
        }
        __ptrace_syscall_info info;
        if (ptrace(PTRACE_GET_SYSCALL_INFO, process, sizeof info, &info) <= 0) return;
        const auto found = Calls().find(info.seccomp.nr);
        if (found == Calls().end()) return;
        call_.name = found->second.name;
        call_.process = process;
        call_.look_ups.clear();
        call_.open_file.clear();
        call_.descriptor.clear();
        const auto& arguments = info.seccomp.args;
        const auto cwd = static_cast<std::uint64_t>(AT_FDCWD);
        switch (found->second.shape) {
            case Shape::kTwoPaths:
                AddPath(process, cwd, arguments[1]);
                [[fallthrough]];
            case Shape::kPath:
                AddPath(process, cwd, arguments[0]);
                break;
            case Shape::kSecondPath:
                AddPath(process, cwd, arguments[1]);
                break;
            case Shape::kTwoAt:
                AddPath(process, arguments[2], arguments[3]);
                [[fallthrough]];
            case Shape::kAt:
                AddPath(process, arguments[0], arguments[1]);
                break;
            case Shape::kSecondAt:
                AddPath(process, arguments[1], arguments[2]);
                break;
            case Shape::kDescriptor:
            case Shape::kListing:
            case Shape::kData:
            case Shape::kSync:
            case Shape::kLock:
                SetOpenFile(process, arguments[0]);
                break;
        }
        const bool begins =
            std::any_of(call_.look_ups.begin(), call_.look_ups.end(),
                        [this](const auto& look_up) { return IsIn(look_up.path, tree_); });
        if (call_.nth == 0 && !begins) return;
        ++call_.nth;
        watching_ = at_call_(call_);
    }

    void SetOpenFile(pid_t process, std::uint64_t descriptor) {
        call_.open_file = DescriptorFile(process, descriptor);
        call_.descriptor = DescriptorPath(process, descriptor);
    }

    void AddPath(pid_t process, std::uint64_t directory, std::uint64_t address) {
        std::string path = TextAt(process, address);
        std::string from = "/";
        // A path below /proc/self/fd goes on from an open file, as one that is relative to it.
        for (const std::string& prefix :
             {std::string("/proc/self/fd/"), "/proc/" + std::to_string(process) + "/fd/"}) {
            if (!path.starts_with(prefix)) continue;
            directory = std::strtoull(path.c_str() + prefix.size(), nullptr, 10);
            const std::size_t slash = path.find('/', prefix.size());
            path = slash == std::string::npos ? "" : path.substr(slash + 1);
        }
        if (!path.starts_with('/')) from = DescriptorFile(process, directory);
        if (path.empty()) {
            SetOpenFile(process, directory);
        } else if (path.front() == '/') {
            call_.look_ups.push_back({Tidy(path), from});
        } else {
            call_.look_ups.push_back({Tidy(from + '/' + path), from});
        }
    }

    const pid_t tool_;
    const std::string& tree_;
    const AtCall& at_call_;
    FileCall call_;
    bool watching_ = true;
    std::set<pid_t> running_;
    std::set<pid_t> expected_;  // made by the tool, and not seen yet
};

std::string TextOfFile(const std::string& path) {
    const Bytes bytes = ReadFile(path);
    return {bytes.begin(), bytes.end()};
}

// This process, and those that it makes, stay on one processor until the end of its scope: they
// wait for each other at every call, and take half the time where none is to be woken for that.
class OneProcessor {
 public:
    OneProcessor() {
        if (sched_getaffinity(0, sizeof before_, &before_) != 0) return;
        cpu_set_t one;
        CPU_ZERO(&one);
        CPU_SET(static_cast<std::size_t>(std::max(sched_getcpu(), 0)), &one);
        changed_ = sched_setaffinity(0, sizeof one, &one) == 0;
    }
    ~OneProcessor() {
        if (changed_) (void)sched_setaffinity(0, sizeof before_, &before_);
    }
    OneProcessor(const OneProcessor&) = delete;
    OneProcessor& operator=(const OneProcessor&) = delete;

 private:
    cpu_set_t before_;
    bool changed_ = false;
};

// Nobody can look for leaks in a process that is traced.
void LookForNoLeaks() {
    const char* const options = getenv("ASAN_OPTIONS");
    const std::string all =
        (options != nullptr ? std::string(options) + ':' : std::string()) + "detect_leaks=0";
    setenv("ASAN_OPTIONS", all.c_str(), 1);
}

// Stops this process until a tracer lets it go on, and then at its calls.
bool BeTraced(StopAtCalls& stop) {
    return ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) == 0 && raise(SIGSTOP) == 0 && stop.Begin();
}

}  // namespace

bool FileCall::Sees(const std::string& path) const {
    for (const LookUp& look_up : look_ups) {
        if (IsIn(look_up.path, path) && !IsIn(look_up.from, path)) return true;
        // Where that leads depends on what has been moved.
        if ((look_up.path + '/').find("/../") != std::string::npos) return true;
    }
    return name.starts_with("getdents") &&
           std::filesystem::path(path).parent_path() == std::filesystem::path(open_file);
}

bool FileCall::OnlyLooks() const {
    return name.find("stat") != std::string::npos || name.find("access") != std::string::npos ||
           name.starts_with("readlink") || name.starts_with("getdents");
}

std::vector<std::string> FileCall::FilesWithoutNames(const std::string& tree) const {
    std::vector<std::string> files;
    const std::string descriptors = "/proc/" + std::to_string(process) + "/fd";
    for (const auto& entry : std::filesystem::directory_iterator(descriptors)) {
        const std::string leads_to = LinkTarget(entry.path().string());
        if (IsIn(leads_to, tree) && leads_to.ends_with(" (deleted)")) {
            files.push_back(entry.path().string());
        }
    }
    return files;
}

bool FileCall::Syncs() const { return name.find("sync") != std::string::npos; }

bool FileCall::Changes() const {
    constexpr const char* kReading[] = {"getxattr", "listxattr", "statfs",         "chdir",
                                        "exec",     "open",      "name_to_handle", "pread"};
    return !OnlyLooks() && !Syncs() &&
           std::none_of(std::begin(kReading), std::end(kReading), [this](const char* reading) {
               return name.find(reading) != std::string::npos;
           });
}

void PrintTo(const FileCall& call, std::ostream* out) {
    *out << "call " << call.nth << ", " << call.name;
    for (const FileCall::LookUp& look_up : call.look_ups) {
        *out << ' ' << look_up.path;
        if (look_up.from != "/") *out << " (from the open " << look_up.from << ')';
    }
    if (!call.open_file.empty()) *out << " of the open " << call.open_file;
}

StoppedRun RunStopped(const Arguments& arguments, const std::string& tree, const AtCall& at_call,
                      Stops stops) {
    const TempDir dir(FastDirectory());
    ToolStart tool(arguments);
    StopAtCalls stop(stops);
    const OneProcessor together;
    const std::string out = dir / "out";
    const std::string err = dir / "err";
    const pid_t child = fork();
    if (child < 0) abort();
    if (child == 0) {
        const int fds[] = {open("/dev/null", O_RDONLY), open(out.c_str(), O_WRONLY | O_CREAT, 0600),
                           open(err.c_str(), O_WRONLY | O_CREAT, 0600)};
        for (int i = 0; i < 3; ++i) {
            if (dup2(fds[i], i) != i) _exit(126);
        }
        LookForNoLeaks();
        alarm(60);  // for what waits for ever
        if (!BeTraced(stop)) _exit(126);
        tool.Exec();
        _exit(127);
    }
    StoppedRun run;
    int status = 0;
    if (waitpid(child, &status, __WALL) != child) abort();
    if (WIFSTOPPED(status)) {
        Tracer tracer(child, tree, at_call);
        status = tracer.Follow();
        run.calls = tracer.calls();
    }
    run.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    run.out = TextOfFile(out);
    run.err = TextOfFile(err);
    return run;
}

StoppedRun RunStoppedAt(const Arguments& arguments, const std::string& tree, int nth,
                        const std::function<void()>& attack) {
    return RunStopped(arguments, tree, [&](const FileCall& call) {
        if (call.nth == nth) attack();
        return call.nth < nth;
    });
}

StoppedRun RunKilledAt(const Arguments& arguments, const std::string& tree, int nth) {
    return RunStopped(
        arguments, tree,
        [&](const FileCall& call) {
            if (!call.Changes() || --nth != 0) return true;
            kill(call.process, SIGKILL);
            return false;
        },
        Stops::kAtDataToo);
}

std::string WhyNotStopped() {
    static const std::string why_not = [] {
        StopAtCalls stop(Stops::kAtNames);
        const pid_t child = fork();
        if (child < 0) return std::string("fork: ") + strerror(errno);
        if (child == 0) _exit(BeTraced(stop) ? access("/", F_OK) : 1);
        int status = 0;
        if (waitpid(child, &status, 0) != child || !WIFSTOPPED(status)) {
            return std::string("processes may not be traced here");
        }
        int calls = 0;
        const std::string root = "/";
        (void)Tracer(child, root, [&calls](const FileCall&) { return ++calls > 0; }).Follow();
        return std::string(calls == 0 ? "the kernel does not show the calls of others" : "");
    }();
    return why_not;
}

}  // namespace mavoea::test

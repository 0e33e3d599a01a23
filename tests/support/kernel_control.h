// Control over the kernel seam (platform/kernel.h) in tests: calls that fail or come back short,
// stand-ins, a log of the calls made.
//
// Call names are the C library's in lower case: "open", "close", "pread", "preadv", "pwrite",
// "pwritev", "lseek", "ftruncate", "fallocate", "fsync", "sync", "fstat", "stat", "lstat",
// "access", "setlock", "getlock", "mkdir", "link", "unlink", "rmdir", "remove", "rename", "chmod",
// "fchmod", "getcwd", "opendir", "readdir", "rewinddir", "closedir", "geteuid",
// "seteuid", "getpid", "time", "system", "listxattr", "getxattr", "setxattr", "removexattr",
// "fopen", "fread", "fwrite", "fclose", "archive", "command" (the platform's system call 403),
// "malloc" (every allocation).
#ifndef MAVOEA_TESTS_SUPPORT_KERNEL_CONTROL_H_
#define MAVOEA_TESTS_SUPPORT_KERNEL_CONTROL_H_

#include <stdio.h>
#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace mavoea::test {

// Makes the nth call from here on (counted from 1, over all calls that can fail, allocations
// included) fail with `error`. Ends with its scope; one at a time.
class FailNthCall {
 public:
    FailNthCall(int nth, int error);
    ~FailNthCall();
    FailNthCall(const FailNthCall&) = delete;
    FailNthCall& operator=(const FailNthCall&) = delete;

    bool fired() const;
    std::string name() const;  // of the call that failed; empty when none did
};

// Makes the nth call of one name (from 1) fail with `error`, or every one with nth 0. One at a
// time.
class FailCall {
 public:
    FailCall(std::string name, int error, int nth = 1);
    ~FailCall();
    FailCall(const FailCall&) = delete;
    FailCall& operator=(const FailCall&) = delete;

    bool fired() const;
};

// Lets the nth "pread", "preadv", "pwrite", "pwritev", "fread" or "fwrite" transfer `bytes` bytes
// at most and, unless `once`, every later one of that name nothing at all. One at a time.
class ShortCall {
 public:
    ShortCall(std::string name, int nth, size_t bytes, bool once = false);
    ~ShortCall();
    ShortCall(const ShortCall&) = delete;
    ShortCall& operator=(const ShortCall&) = delete;

    bool fired() const;
};

// The names of the calls made since the last time, in order; allocations are left out.
std::vector<std::string> TakeCallNames();

// The same with the arguments that matter: "open(/v/a, O_RDWR|O_CREAT, 0777)", "pread(16384, 82)"
// (size, offset), "pwritev(139, 0)", "chmod(/v/a, 0744)", "fchmod(/v/a, 0777)", "seteuid(0)",
// "setxattr(/v/a, user.x, 3, 0)", ...
std::vector<std::string> TakeCalls();

// What allocations there have been since the last time: the largest one and all added up, in bytes.
struct Allocations {
    unsigned long long largest = 0;
    unsigned long long total = 0;
    int live = 0;  // blocks allocated and not freed yet, since the process started
    unsigned long long live_bytes = 0;  // what those blocks hold
    unsigned long long peak = 0;        // the most that live_bytes was since the last time
};
Allocations TakeAllocations();

// How many bytes "pwrite", "pwritev", "fwrite" and "setxattr" have written since the last time.
unsigned long long TakeBytesWritten();

// What a call that succeeded has changed on disk.
struct FileChange {
    enum Kind {
        kWritten,        // `bytes` at `offset` of the file on `fd`
        kResized,        // the file on `fd` has `offset` bytes
        kSynced,         // the file on `fd`
        kAllSynced,      // every file
        kCreated,        // `path`, a file that was not there, open on `fd`; empty: without a name
        kLinked,         // `path` has the further name, or its first, `to`
        kRenamed,        // `path`, which is now `to`
        kRemoved,        // `path`
        kMadeDirectory,  // `path`
    };
    Kind kind;
    int fd = -1;
    off_t offset = 0;
    std::vector<std::uint8_t> bytes = {};
    std::string path = {};
    std::string to = {};
};

// Stand-ins, used where they are set; all are cleared by ResetKernel(), which fixtures call.
struct KernelHooks {
    std::function<int(const char*, struct stat*)> stat;
    std::function<int(const char*, struct stat*)> lstat;
    std::function<FILE*(const char*, const char*)> fopen;
    std::function<int(const char*, mode_t)> chmod;
    std::function<int(const char*, mode_t)> mkdir;
    std::function<uid_t()> geteuid;
    std::function<int(uid_t)> seteuid;
    std::function<ssize_t(const char*, char*, size_t)> listxattr;
    std::function<ssize_t(const char*, const char*, void*, size_t)> getxattr;
    std::function<int(const char*, const char*, const void*, size_t, int)> setxattr;
    std::function<int(const char*, const char*)> removexattr;
    std::function<int(int)> archive;
    std::function<int(const char*, int)> command;
    std::function<time_t()> time;
    std::function<int(int)> fsync;
    std::function<void()> sync;
    std::function<void(const std::string& name)> before;    // before every call of any name
    std::function<void(const FileChange& change)> changed;  // after every call with that effect
    // An errno for the call, as TakeCalls() tells it ("malloc(80)" is one too), or 0 to let it go.
    std::function<int(const std::string& call)> fails;
    std::function<size_t(size_t size)> grants;   // how much of `size` bytes a transfer may move
    std::function<void(long long result)> gave;  // after every call that was let go
    std::function<void(int fd)> opened;  // after every "open", "opendir" and "fopen" that succeeded
};
KernelHooks& Hooks();

// Clears hooks, call logs and figures (not what is live of the heap).
void ResetKernel();

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_KERNEL_CONTROL_H_

// The kernel seam that tests link.

#include "tests/support/kernel_control.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <sys/uio.h>
#include <sys/xattr.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <optional>
#include <type_traits>
#include <utility>

#include "platform/descriptors.h"
#include "platform/kernel.h"
#include "platform/marks.h"

namespace mavoea::test {
namespace {

struct Fault {
    std::string name;  // empty: any call
    int nth = 1;       // 0: every call
    int error = 0;     // 0: a short transfer
    size_t bytes = 0;
    bool once = false;
    int seen = 0;
    bool fired = false;
    std::string fired_name{};
};

struct State {
    std::optional<Fault> fault;
    std::vector<std::string> names;
    std::vector<std::string> calls;
    Allocations allocations;
    unsigned long long written = 0;
    KernelHooks hooks;
};

// Never destroyed: allocations go on while the process exits.
State& TheState() {
    static State& state = *new State;
    return state;
}

void Arm(Fault fault) {
    if (TheState().fault) abort();  // One at a time.
    TheState().fault = std::move(fault);
}

void Disarm() { TheState().fault.reset(); }

// True when this call is to fail; errno is then set.
bool Fails(const std::string& name, const std::string& call) {
    if (TheState().hooks.fails) {
        const int error = TheState().hooks.fails(call);
        if (error != 0) {
            errno = error;
            return true;
        }
    }
    auto& fault = TheState().fault;
    if (!fault || fault->error == 0) return false;
    if (!fault->name.empty() && fault->name != name) return false;
    ++fault->seen;
    if (fault->nth != 0 && fault->seen != fault->nth) return false;
    fault->fired = true;
    fault->fired_name = name;
    errno = fault->error;
    return true;
}

// How much of `size` this transfer may move.
size_t Granted(const std::string& name, size_t size) {
    if (TheState().hooks.grants) return TheState().hooks.grants(size);
    auto& fault = TheState().fault;
    if (!fault || fault->error != 0 || fault->name != name) return size;
    ++fault->seen;
    if (fault->seen < fault->nth) return size;
    if (fault->seen > fault->nth) return fault->once ? size : 0;
    fault->fired = true;
    return std::min(size, fault->bytes);
}

void Note(const std::string& name, const std::string& call) {
    const int saved = errno;
    State& state = TheState();
    if (state.hooks.before) state.hooks.before(name);
    state.names.push_back(name);
    state.calls.push_back(call);
    errno = saved;
}

template <class Result, class Real>
Result Call(const std::string& name, const std::string& arguments, Result failure, Real real) {
    const std::string call = name + "(" + arguments + ")";
    Note(name, call);
    if (Fails(name, call)) return failure;
    const Result result = real();
    if constexpr (std::is_integral_v<Result>) {
        const int saved = errno;
        if (TheState().hooks.gave) TheState().hooks.gave(static_cast<long long>(result));
        errno = saved;
    }
    return result;
}

// Tells whoever wants to know what a call has done to the disk, if it succeeded.
template <class Change>
void Tell(bool done, Change change) {
    if (!done || !Hooks().changed) return;
    const int saved = errno;
    Hooks().changed(change());
    errno = saved;
}

std::string Text(const char* text) { return text == nullptr ? "NULL" : text; }
std::string Number(long long value) { return std::to_string(value); }

std::string PathOf(int fd) {
    return std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(fd)).string();
}

std::string WholePath(int dir, const char* path) {
    return dir == AT_FDCWD ? path : PathOf(dir) + "/" + path;
}

std::string Octal(unsigned value) {
    std::string text;
    do {
        text.insert(text.begin(), static_cast<char>('0' + value % 8));
        value /= 8;
    } while (value != 0);
    return "0" + text;
}

std::string Flags(int flags) {
    std::string text = (flags & O_ACCMODE) == O_RDWR     ? "O_RDWR"
                       : (flags & O_ACCMODE) == O_WRONLY ? "O_WRONLY"
                                                         : "O_RDONLY";
    constexpr std::pair<int, const char*> kNames[] = {
        {O_CREAT, "O_CREAT"},         {O_EXCL, "O_EXCL"},
        {O_TRUNC, "O_TRUNC"},         {O_NONBLOCK, "O_NONBLOCK"},
        {O_CLOEXEC, "O_CLOEXEC"},     {O_NOFOLLOW, "O_NOFOLLOW"},
        {O_DIRECTORY, "O_DIRECTORY"}, {O_TMPFILE & ~O_DIRECTORY, "O_TMPFILE"},
    };
    for (const auto& [bit, name] : kNames) {
        if ((flags & bit) != 0) text += std::string("|") + name;
    }
    return text;
}

size_t SizeOf(const iovec* parts, int count) {
    size_t size = 0;
    for (int i = 0; i < count; ++i) size += parts[i].iov_len;
    return size;
}

// The first `size` bytes of `parts`.
std::vector<iovec> Cut(const iovec* parts, int count, size_t size) {
    std::vector<iovec> cut(parts, parts + count);
    for (iovec& part : cut) {
        part.iov_len = std::min(part.iov_len, size);
        size -= part.iov_len;
    }
    return cut;
}

// Each block carries its size in front, so that what is live can be told.
constexpr size_t kBlockHead = 16;

void* Adopt(void* head, unsigned long long size) {
    if (head == nullptr) return nullptr;
    *static_cast<unsigned long long*>(head) = size;
    return static_cast<char*>(head) + kBlockHead;
}

void* HeadOf(void* block) {
    return block == nullptr ? nullptr : static_cast<char*>(block) - kBlockHead;
}

unsigned long long SizeOf(void* block) {
    return block == nullptr ? 0 : *static_cast<unsigned long long*>(HeadOf(block));
}

// A block of `former` bytes has become one of `size`.
void NoteLiveBytes(unsigned long long former, unsigned long long size) {
    Allocations& allocations = TheState().allocations;
    allocations.live_bytes = allocations.live_bytes - former + size;
    allocations.peak = std::max(allocations.peak, allocations.live_bytes);
}

int NoteOpened(int fd) {
    const int saved = errno;
    if (fd >= 0 && Hooks().opened) Hooks().opened(fd);
    errno = saved;
    return fd;
}
DIR* NoteOpened(DIR* dir) {
    if (dir != nullptr) NoteOpened(::dirfd(dir));
    return dir;
}
FILE* NoteOpened(FILE* stream) {
    if (stream != nullptr) NoteOpened(::fileno(stream));
    return stream;
}

// The result of a call that writes.
template <class Result>
Result NoteWritten(Result count) {
    if (count > 0) TheState().written += static_cast<unsigned long long>(count);
    return count;
}

// The same of one that writes the first bytes of `parts` to a file.
ssize_t NoteWritten(int fd, const iovec* parts, int count, off_t offset, ssize_t put) {
    Tell(put > 0, [&] {
        FileChange change{.kind = FileChange::kWritten, .fd = fd, .offset = offset};
        for (const iovec& part : Cut(parts, count, static_cast<size_t>(put))) {
            const auto* const first = static_cast<const std::uint8_t*>(part.iov_base);
            change.bytes.insert(change.bytes.end(), first, first + part.iov_len);
        }
        return change;
    });
    return NoteWritten(put);
}

// The result of `open`, which opens `path`.
template <class Real>
int Opened(const char* path, int flags, Real open) {
    struct stat info;
    const bool nameless = (flags & O_TMPFILE) == O_TMPFILE;
    const bool made =
        Hooks().changed &&
        (nameless || ((flags & O_CREAT) != 0 && ::lstat(path, &info) != 0 && errno == ENOENT));
    const int fd = open();
    Tell(fd >= 0 && made, [&] {
        return FileChange{.kind = FileChange::kCreated, .fd = fd, .path = nameless ? "" : path};
    });
    Tell(fd >= 0 && !made && (flags & O_TRUNC) != 0,
         [&] { return FileChange{.kind = FileChange::kResized, .fd = fd}; });
    return NoteOpened(fd);
}

bool AllocationFails(unsigned long long size) {
    Allocations& allocations = TheState().allocations;
    allocations.largest = std::max(allocations.largest, size);
    allocations.total += size;
    if (Fails("malloc", "malloc(" + std::to_string(size) + ")")) return true;
    if (size > SIZE_MAX - kBlockHead) {
        errno = ENOMEM;
        return true;
    }
    return false;
}

}  // namespace

FailNthCall::FailNthCall(int nth, int error) { Arm({.name = "", .nth = nth, .error = error}); }
FailNthCall::~FailNthCall() { Disarm(); }
bool FailNthCall::fired() const { return TheState().fault->fired; }
std::string FailNthCall::name() const { return TheState().fault->fired_name; }

FailCall::FailCall(std::string name, int error, int nth) {
    Arm({.name = std::move(name), .nth = nth, .error = error});
}
FailCall::~FailCall() { Disarm(); }
bool FailCall::fired() const { return TheState().fault->fired; }

ShortCall::ShortCall(std::string name, int nth, size_t bytes, bool once) {
    Arm({.name = std::move(name), .nth = nth, .error = 0, .bytes = bytes, .once = once});
}
ShortCall::~ShortCall() { Disarm(); }
bool ShortCall::fired() const { return TheState().fault->fired; }

std::vector<std::string> TakeCallNames() {
    TheState().calls.clear();
    return std::exchange(TheState().names, {});
}

std::vector<std::string> TakeCalls() {
    TheState().names.clear();
    return std::exchange(TheState().calls, {});
}

Allocations TakeAllocations() {
    Allocations& now = TheState().allocations;
    return std::exchange(
        now, Allocations{.live = now.live, .live_bytes = now.live_bytes, .peak = now.live_bytes});
}

unsigned long long TakeBytesWritten() { return std::exchange(TheState().written, 0); }

KernelHooks& Hooks() { return TheState().hooks; }

void ResetKernel() {
    State& state = TheState();
    state.hooks = {};
    state.names.clear();
    state.calls.clear();
    state.written = 0;
    TakeAllocations();
}

}  // namespace mavoea::test

namespace mavoea::kernel {

using namespace mavoea::test;

int Open(const char* path, int flags, mode_t mode) { return OpenAt(AT_FDCWD, path, flags, mode); }

int OpenRegular(const char* path, int flags, mode_t mode) {
    return Call(
        "open", Text(path) + ", " + Flags(RegularFileFlags(flags)) + ", " + Octal(mode), -1,
        [&] { return Opened(path, flags, [&] { return OpenRegularFile(path, flags, mode); }); });
}

int OpenToRead(const char* path, unsigned long long* size) {
    return Call(
        "open", Text(path) + ", " + Flags(RegularFileFlags(kReadFlags)) + ", " + Octal(0), -1, [&] {
            return Opened(path, kReadFlags, [&] { return OpenRegularFileToRead(path, size); });
        });
}

// Calls that take a directory are logged, and stood in for, under the whole path.
int OpenAt(int dir, const char* path, int flags, mode_t mode) {
    const std::string whole = WholePath(dir, path);
    return Call("open", whole + ", " + Flags(flags) + ", " + Octal(mode), -1, [&] {
        return Opened(whole.c_str(), flags, [&] { return ::openat(dir, path, flags, mode); });
    });
}

int Close(int fd) {
    Note("close", "close()");
    return ::close(fd);
}

ssize_t Pread(int fd, void* buffer, size_t size, off_t offset) {
    return Call("pread", Number(static_cast<long long>(size)) + ", " + Number(offset), ssize_t{-1},
                [&] { return ::pread(fd, buffer, Granted("pread", size), offset); });
}

ssize_t Preadv(int fd, const iovec* parts, int count, off_t offset) {
    const size_t size = SizeOf(parts, count);
    return Call("preadv", Number(static_cast<long long>(size)) + ", " + Number(offset), ssize_t{-1},
                [&] {
                    const auto cut = Cut(parts, count, Granted("preadv", size));
                    return ::preadv(fd, cut.data(), count, offset);
                });
}

ssize_t Pwrite(int fd, const void* bytes, size_t size, off_t offset) {
    return Call(
        "pwrite", Number(static_cast<long long>(size)) + ", " + Number(offset), ssize_t{-1}, [&] {
            const iovec part = {const_cast<void*>(bytes), Granted("pwrite", size)};
            return NoteWritten(fd, &part, 1, offset, ::pwrite(fd, bytes, part.iov_len, offset));
        });
}

ssize_t Pwritev(int fd, const iovec* parts, int count, off_t offset) {
    const size_t size = SizeOf(parts, count);
    return Call("pwritev", Number(static_cast<long long>(size)) + ", " + Number(offset),
                ssize_t{-1}, [&] {
                    const auto cut = Cut(parts, count, Granted("pwritev", size));
                    return NoteWritten(fd, cut.data(), count, offset,
                                       ::pwritev(fd, cut.data(), count, offset));
                });
}

off_t Lseek(int fd, off_t offset, int whence) {
    return Call("lseek", Number(offset) + ", " + Number(whence), off_t{-1},
                [&] { return ::lseek(fd, offset, whence); });
}

int Ftruncate(int fd, off_t size) {
    return Call("ftruncate", Number(size), -1, [&] {
        const int result = ::ftruncate(fd, size);
        Tell(result == 0,
             [&] { return FileChange{.kind = FileChange::kResized, .fd = fd, .offset = size}; });
        return result;
    });
}

int Reserve(int fd, off_t offset, off_t size) {
    return Call("fallocate", Number(offset) + ", " + Number(size), -1,
                [&] { return ::fallocate(fd, FALLOC_FL_KEEP_SIZE, offset, size); });
}

int Fsync(int fd) {
    return Call("fsync", "", -1, [&] {
        const int result = Hooks().fsync ? Hooks().fsync(fd) : ::fsync(fd);
        Tell(result == 0, [&] { return FileChange{.kind = FileChange::kSynced, .fd = fd}; });
        return result;
    });
}

void Sync() {
    Note("sync", "sync()");
    if (Hooks().sync) {
        Hooks().sync();
    } else {
        ::sync();
    }
    Tell(true, [] { return FileChange{.kind = FileChange::kAllSynced}; });
}

int Fstat(int fd, struct stat* info) {
    return Call("fstat", "", -1, [&] { return ::fstat(fd, info); });
}

int Stat(const char* path, struct stat* info) {
    return Call("stat", Text(path), -1,
                [&] { return Hooks().stat ? Hooks().stat(path, info) : ::stat(path, info); });
}

int Lstat(const char* path, struct stat* info) {
    return Call("lstat", Text(path), -1,
                [&] { return Hooks().lstat ? Hooks().lstat(path, info) : ::lstat(path, info); });
}

// A "stat" or, with AT_SYMLINK_NOFOLLOW, an "lstat" of the whole path.
int FstatAt(int dir, const char* path, struct stat* info, int flags) {
    const std::string whole = WholePath(dir, path);
    const bool itself = (flags & AT_SYMLINK_NOFOLLOW) != 0;
    const auto& hook = itself ? Hooks().lstat : Hooks().stat;
    return Call(itself ? "lstat" : "stat", whole, -1, [&] {
        return hook ? hook(whole.c_str(), info) : ::fstatat(dir, path, info, flags);
    });
}

int Access(const char* path, int mode) {
    return Call("access", Text(path) + ", " + Number(mode), -1,
                [&] { return ::access(path, mode); });
}

int SetLock(int fd, const struct flock64* lock) {
    return Call("setlock", Number(lock->l_type), -1, [&] { return ::fcntl(fd, F_SETLK64, lock); });
}

int GetLock(int fd, struct flock64* lock) {
    return Call("getlock", Number(lock->l_type), -1, [&] { return ::fcntl(fd, F_GETLK64, lock); });
}

int MkdirAt(int dir, const char* path, mode_t mode) {
    const std::string whole = WholePath(dir, path);
    return Call("mkdir", whole + ", " + Octal(mode), -1, [&] {
        const int result =
            Hooks().mkdir ? Hooks().mkdir(whole.c_str(), mode) : ::mkdirat(dir, path, mode);
        Tell(result == 0,
             [&] { return FileChange{.kind = FileChange::kMadeDirectory, .path = whole}; });
        return result;
    });
}

int Link(const char* from, const char* to, int flags) {
    return Call("link", Text(from) + ", " + Text(to), -1, [&] {
        const int result = ::linkat(AT_FDCWD, from, AT_FDCWD, to, flags);
        Tell(result == 0,
             [&] { return FileChange{.kind = FileChange::kLinked, .path = from, .to = to}; });
        return result;
    });
}

static int Removed(const char* path, int result) {
    Tell(result == 0, [&] { return FileChange{.kind = FileChange::kRemoved, .path = path}; });
    return result;
}

int Unlink(const char* path) {
    return Call("unlink", Text(path), -1, [&] { return Removed(path, ::unlink(path)); });
}

int UnlinkAt(int dir, const char* path, int flags) {
    const std::string whole = WholePath(dir, path);
    return Call(flags == AT_REMOVEDIR ? "rmdir" : "unlink", whole, -1,
                [&] { return Removed(whole.c_str(), ::unlinkat(dir, path, flags)); });
}

int Rmdir(const char* path) {
    return Call("rmdir", Text(path), -1, [&] { return Removed(path, ::rmdir(path)); });
}

int Remove(const char* path) {
    return Call("remove", Text(path), -1, [&] { return Removed(path, ::remove(path)); });
}

int Rename(const char* from, const char* to) { return RenameAt(AT_FDCWD, from, AT_FDCWD, to); }

int RenameAt(int from_dir, const char* from, int to_dir, const char* to) {
    const std::string former = WholePath(from_dir, from);
    const std::string now = WholePath(to_dir, to);
    return Call("rename", former + ", " + now, -1, [&] {
        const int result = ::renameat(from_dir, from, to_dir, to);
        Tell(result == 0,
             [&] { return FileChange{.kind = FileChange::kRenamed, .path = former, .to = now}; });
        return result;
    });
}

int Chmod(const char* path, mode_t mode) {
    return Call("chmod", Text(path) + ", " + Octal(mode), -1,
                [&] { return Hooks().chmod ? Hooks().chmod(path, mode) : ::chmod(path, mode); });
}

int Fchmod(int fd, mode_t mode) {
    return Call("fchmod", PathOf(fd) + ", " + Octal(mode), -1, [&] { return ::fchmod(fd, mode); });
}

char* Getcwd(char* buffer, size_t size) {
    return Call("getcwd", Number(static_cast<long long>(size)), static_cast<char*>(nullptr),
                [&] { return ::getcwd(buffer, size); });
}

DIR* Opendir(const char* path) {
    return Call("opendir", Text(path), static_cast<DIR*>(nullptr),
                [&] { return NoteOpened(::opendir(path)); });
}

DIR* OpendirItself(const char* path) {
    return Call("opendir", Text(path), static_cast<DIR*>(nullptr),
                [&] { return NoteOpened(OpenDirectoryItself(path)); });
}

dirent* Readdir(DIR* dir) {
    return Call("readdir", "", static_cast<dirent*>(nullptr), [&] { return ::readdir(dir); });
}

void Rewinddir(DIR* dir) {
    Note("rewinddir", "rewinddir()");
    ::rewinddir(dir);
}

int Dirfd(DIR* dir) { return ::dirfd(dir); }

int Closedir(DIR* dir) {
    Note("closedir", "closedir()");
    return ::closedir(dir);
}

uid_t Geteuid() {
    Note("geteuid", "geteuid()");
    return Hooks().geteuid ? Hooks().geteuid() : ::geteuid();
}

int Seteuid(uid_t uid) {
    return Call("seteuid", Number(uid), -1,
                [&] { return Hooks().seteuid ? Hooks().seteuid(uid) : ::seteuid(uid); });
}

pid_t Getpid() {
    Note("getpid", "getpid()");
    return ::getpid();
}

time_t Time() {
    Note("time", "time()");
    return Hooks().time ? Hooks().time() : ::time(nullptr);
}

int System(const char* command) {
    return Call("system", Text(command), -1, [&] { return ::system(command); });
}

ssize_t Listxattr(const char* path, char* names, size_t size) {
    return Call("listxattr", Text(path) + ", " + Number(static_cast<long long>(size)), ssize_t{-1},
                [&] {
                    return Hooks().listxattr ? Hooks().listxattr(path, names, size)
                                             : ::listxattr(path, names, size);
                });
}

ssize_t Getxattr(const char* path, const char* name, void* value, size_t size) {
    return Call("getxattr",
                Text(path) + ", " + Text(name) + ", " + Number(static_cast<long long>(size)),
                ssize_t{-1}, [&] {
                    return Hooks().getxattr ? Hooks().getxattr(path, name, value, size)
                                            : ::getxattr(path, name, value, size);
                });
}

int Setxattr(const char* path, const char* name, const void* value, size_t size, int flags) {
    return Call("setxattr",
                Text(path) + ", " + Text(name) + ", " + Number(static_cast<long long>(size)) +
                    ", " + Number(flags),
                -1, [&] {
                    const int result = Hooks().setxattr
                                           ? Hooks().setxattr(path, name, value, size, flags)
                                           : ::setxattr(path, name, value, size, flags);
                    if (result == 0) NoteWritten(size);
                    return result;
                });
}

int Removexattr(const char* path, const char* name) {
    return Call("removexattr", Text(path) + ", " + Text(name), -1, [&] {
        return Hooks().removexattr ? Hooks().removexattr(path, name) : ::removexattr(path, name);
    });
}

FILE* Fopen(const char* path, const char* mode) {
    return Call("fopen", Text(path) + ", " + mode, static_cast<FILE*>(nullptr), [&] {
        return NoteOpened(Hooks().fopen ? Hooks().fopen(path, mode) : ::fopen(path, mode));
    });
}

size_t Fread(void* buffer, size_t size, FILE* stream) {
    return Call("fread", Number(static_cast<long long>(size)), size_t{0},
                [&] { return ::fread(buffer, 1, Granted("fread", size), stream); });
}

size_t Fwrite(const void* bytes, size_t size, FILE* stream) {
    return Call("fwrite", Number(static_cast<long long>(size)), size_t{0},
                [&] { return NoteWritten(::fwrite(bytes, 1, Granted("fwrite", size), stream)); });
}

// A close that is made to fail closes all the same, as the C library's does.
int Fclose(FILE* stream) {
    Note("fclose", "fclose()");
    const int result = ::fclose(stream);
    return Fails("fclose", "fclose()") ? EOF : result;
}

int SetArchiveBit(int fd) {
    return Call("archive", "", -1,
                [&] { return Hooks().archive ? Hooks().archive(fd) : marks::SetArchiveBit(fd); });
}

// As a kernel that has the call takes it.
int SetArchiveBit(const char* path) {
    const int fd = Open(path, O_RDONLY | O_NONBLOCK | O_CLOEXEC, 0);
    if (fd < 0) return -1;
    const int result = SetArchiveBit(fd);
    const int error = errno;
    Close(fd);
    errno = error;
    return result;
}

int FileCommand(const char* path, int command) {
    return Call("command", Text(path) + ", " + Number(command), -1, [&] {
        return Hooks().command ? Hooks().command(path, command) : marks::FileCommand(path, command);
    });
}

void* Allocate(unsigned long long size) {
    if (AllocationFails(size)) return nullptr;
    void* const head = ::malloc(static_cast<size_t>(size) + kBlockHead);
    if (head != nullptr) {
        ++TheState().allocations.live;
        NoteLiveBytes(0, size);
    }
    return Adopt(head, size);
}

void* AllocateZeroed(unsigned long long size) {
    if (AllocationFails(size)) return nullptr;
    void* const head = ::calloc(1, static_cast<size_t>(size) + kBlockHead);
    if (head != nullptr) {
        ++TheState().allocations.live;
        NoteLiveBytes(0, size);
    }
    return Adopt(head, size);
}

void* Reallocate(void* block, unsigned long long size) {
    if (AllocationFails(size)) return nullptr;
    const unsigned long long former = SizeOf(block);
    void* const head = ::realloc(HeadOf(block), static_cast<size_t>(size) + kBlockHead);
    if (head != nullptr && block == nullptr) ++TheState().allocations.live;
    if (head != nullptr) NoteLiveBytes(former, size);
    return Adopt(head, size);
}

void Free(void* block) {
    if (block == nullptr) return;
    --TheState().allocations.live;
    NoteLiveBytes(SizeOf(block), 0);
    ::free(HeadOf(block));
}

}  // namespace mavoea::kernel

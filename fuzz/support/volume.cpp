#include "fuzz/support/volume.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <string_view>

#include "platform/include/mavocore.h"

namespace mavoea::fuzz {
namespace {

// ---- Extended attributes ------------------------------------------------------------------------

// As many as a stream in an input can have, and some. A value has 64 KiB at most, as on Linux.
struct Attribute {
    char path[256];
    char name[256];
    std::size_t size;
    std::uint8_t value[65536];
};
Attribute attributes[512];
std::size_t attribute_count = 0;

Attribute* FindAttribute(const char* path, const char* name) {
    for (std::size_t i = 0; i < attribute_count; ++i) {
        Attribute& found = attributes[i];
        if (strcmp(found.path, path) == 0 && strcmp(found.name, name) == 0) return &found;
    }
    return nullptr;
}

template <class Result>
Result Refuse(int error) {
    errno = error;
    return static_cast<Result>(-1);
}

int Store(const char* path, const char* name, View value, int flags) {
    const std::size_t length = strlen(name);
    if (length == 0 || length > 255) return Refuse<int>(ERANGE);
    if (strlen(path) > 255 || value.size() > sizeof attributes[0].value) return Refuse<int>(E2BIG);
    Attribute* found = FindAttribute(path, name);
    if (found != nullptr && (flags & XATTR_CREATE) != 0) return Refuse<int>(EEXIST);
    if (found == nullptr && (flags & XATTR_REPLACE) != 0) return Refuse<int>(ENODATA);
    if (found == nullptr) {
        if (attribute_count == std::size(attributes)) return Refuse<int>(ENOSPC);
        found = &attributes[attribute_count++];
        strcpy(found->path, path);
        strcpy(found->name, name);
    }
    found->size = value.size();
    std::copy(value.begin(), value.end(), found->value);
    return 0;
}

// ---- Files --------------------------------------------------------------------------------------

// Removes what is at `name` of the directory `parent`, which may be nothing.
void RemoveAt(int parent, const char* name) {
    if (unlinkat(parent, name, 0) == 0 || (errno != EISDIR && errno != EPERM)) return;
    if (unlinkat(parent, name, AT_REMOVEDIR) == 0) return;
    const int fd = openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    DIR* const directory = fd < 0 ? nullptr : fdopendir(fd);
    if (directory == nullptr) return;
    while (const dirent* const entry = readdir(directory)) {
        const std::string_view inner = entry->d_name;
        if (inner != "." && inner != "..") RemoveAt(dirfd(directory), entry->d_name);
    }
    closedir(directory);
    unlinkat(parent, name, AT_REMOVEDIR);
}

struct OwnFolder {
    OwnFolder() {
        char name[] = "/dev/shm/mavoea-fuzz-XXXXXX";
        if (mkdtemp(name) == nullptr || chmod(name, 0777) != 0) Fail("no folder in /dev/shm");
        path = name;
    }
    ~OwnFolder() { RemoveAt(AT_FDCWD, path.c_str()); }
    OwnFolder(const OwnFolder&) = delete;
    OwnFolder& operator=(const OwnFolder&) = delete;

    std::string path;
};

void WriteAll(int fd, View bytes) {
    if (write(fd, bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size())) {
        Fail("cannot write to memory");
    }
}

// ---- Commands -----------------------------------------------------------------------------------

// As the commands do: 0 or the exit status 1.
int CopyFile(const char* from, const char* to) {
    // Not to wait for a FIFO, which a process of its own could be left to.
    const int in = open(from, O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    struct stat info;
    if (in < 0 || fstat(in, &info) != 0 || !S_ISREG(info.st_mode)) {
        if (in >= 0) close(in);
        return 1;
    }
    const int out = open(to, O_WRONLY | O_CREAT | O_TRUNC | O_NONBLOCK | O_CLOEXEC, 0644);
    int status = out < 0 ? 1 : 0;
    std::uint8_t bytes[16384];
    while (status == 0) {
        const ssize_t got = read(in, bytes, sizeof bytes);
        if (got <= 0) break;
        if (write(out, bytes, static_cast<std::size_t>(got)) != got) status = 1;
    }
    if (out >= 0) close(out);
    close(in);
    return status;
}

// The text between the next two quotes; nothing behind them in `*rest`.
std::string_view Quoted(std::string_view* rest) {
    const std::size_t begin = rest->find('\'');
    const std::size_t end = begin == rest->npos ? begin : rest->find('\'', begin + 1);
    if (end == rest->npos) Fail("no two quoted paths in a command");
    const std::string_view text = rest->substr(begin + 1, end - begin - 1);
    rest->remove_prefix(end + 1);
    return text;
}

}  // namespace

std::uint8_t Input::U8() {
    const View taken = Take(1);
    return taken.empty() ? std::uint8_t{0} : taken[0];
}

std::uint16_t Input::U16() {
    const unsigned high = U8();
    return static_cast<std::uint16_t>(high << 8 | U8());
}

View Input::Take(std::size_t size) {
    const View taken = left_.first(std::min(size, left_.size()));
    left_ = left_.subspan(taken.size());
    return taken;
}

const std::string& Folder() {
    static const OwnFolder folder;
    return folder.path;
}

void Put(const std::string& path, View bytes) {
    const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
    if (fd < 0) Fail("cannot make %s: %s", path.c_str(), strerror(errno));
    WriteAll(fd, bytes);
    close(fd);
}

std::optional<Bytes> Get(const std::string& path) {
    const int fd = open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOATIME | O_CLOEXEC);
    if (fd < 0) return std::nullopt;
    struct stat info;
    std::optional<Bytes> bytes;
    if (fstat(fd, &info) == 0 && S_ISREG(info.st_mode)) bytes = GetAll(fd);
    close(fd);
    return bytes;
}

bool IsThere(const std::string& path) {
    return faccessat(AT_FDCWD, path.c_str(), F_OK, AT_SYMLINK_NOFOLLOW) == 0;
}

void Empty(const std::string& directory) {
    DIR* const open = opendir(directory.c_str());
    if (open == nullptr) Fail("cannot list %s", directory.c_str());
    while (const dirent* const entry = readdir(open)) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") RemoveAt(dirfd(open), entry->d_name);
    }
    closedir(open);
}

int MemoryFile(View bytes) {
    const int fd = memfd_create("fuzz", MFD_CLOEXEC);
    if (fd < 0) Fail("cannot make a file in memory");
    WriteAll(fd, bytes);
    return fd;
}

Bytes GetAll(int fd) {
    struct stat info;
    if (fstat(fd, &info) != 0) Fail("cannot look at a file in memory");
    Bytes bytes(static_cast<std::size_t>(info.st_size));
    if (pread(fd, bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
        Fail("cannot read from memory");
    }
    return bytes;
}

void ClearAttributes() { attribute_count = 0; }

void PutAttribute(const std::string& path, const std::string& name, View value) {
    if (Store(path.c_str(), name.c_str(), value, 0) != 0) Fail("no room for an attribute");
}

std::optional<Bytes> GetAttribute(const std::string& path, const std::string& name) {
    const Attribute* const found = FindAttribute(path.c_str(), name.c_str());
    if (found == nullptr) return std::nullopt;
    return Bytes(found->value, found->value + found->size);
}

int& VolumeType() {
    static int type = 1;
    return type;
}

// The lowest that is free, which a descriptor that stays open would have taken.
int NextDescriptor() {
    const int fd = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0);
    if (fd < 0) Fail("no descriptor is free");
    close(fd);
    return fd;
}

bool CloseKept(int fd, const std::string& path) {
    struct stat open;
    struct stat named;
    if (fstat(fd, &open) != 0 || lstat(path.c_str(), &named) != 0) return false;
    if (open.st_dev != named.st_dev || open.st_ino != named.st_ino) return false;
    close(fd);
    return true;
}

namespace {

const char* WorkingDirectory(char (&path)[PATH_MAX]) {
    return getcwd(path, sizeof path) == nullptr ? "" : path;
}

const std::string& FirstWorkingDirectory() {
    static const std::string first = [] {
        char path[PATH_MAX];
        return std::string(WorkingDirectory(path));
    }();
    return first;
}

}  // namespace

Call::Call(const char* name) : name_(name), next_descriptor_(NextDescriptor()) {
    (void)FirstWorkingDirectory();
    (void)TakeCodes();
    watch_.emplace();
}

std::vector<int> Call::End(std::size_t memory) {
    const std::size_t total = watch_->total();
    const long live = watch_->live();
    watch_.reset();
    if (live != 0) Fail("%s: %ld blocks more than before", name_, live);
    if (total > memory) Fail("%s: took %zu bytes, may take %zu", name_, total, memory);
    if (NextDescriptor() != next_descriptor_) Fail("%s: descriptors are not as before", name_);
    static const uid_t user = geteuid();
    if (geteuid() != user) Fail("%s: another effective user", name_);
    char path[PATH_MAX];
    if (FirstWorkingDirectory() != WorkingDirectory(path)) {
        Fail("%s: another working directory: %s", name_, path);
    }
    std::vector<int> recorded = TakeCodes();
    for (const int code : recorded) {
        if (!IsKnownCode(code)) Fail("%s: no such code: 0x%X", name_, static_cast<unsigned>(code));
    }
    return recorded;
}

}  // namespace mavoea::fuzz

// ---- Stand-ins ----------------------------------------------------------------------------------

using namespace mavoea::fuzz;

namespace {

// Where the fork is kept that `path`, beneath a file, names; other paths are their own.
const char* Kept(const char* path, char (&buffer)[PATH_MAX]) {
    constexpr std::string_view kFork = "/rsrc";
    const std::string_view text = path;
    if (!text.ends_with(kFork) || text.size() >= sizeof buffer) return path;
    memcpy(buffer, path, text.size() + 1);
    buffer[text.size() - kFork.size()] = '#';
    return buffer;
}

ssize_t Give(View bytes, void* to, std::size_t room) {
    if (room == 0) return static_cast<ssize_t>(bytes.size());
    if (room < bytes.size()) return Refuse<ssize_t>(ERANGE);
    if (!bytes.empty()) memcpy(to, bytes.data(), bytes.size());
    return static_cast<ssize_t>(bytes.size());
}

}  // namespace

extern "C" {

ssize_t listxattr(const char* path, char* list, size_t size) {
    static std::array<std::uint8_t, 65536> names;
    std::size_t used = 0;
    for (std::size_t i = 0; i < attribute_count; ++i) {
        const std::size_t length = strlen(attributes[i].name) + 1;
        if (strcmp(attributes[i].path, path) != 0) continue;
        if (used + length > names.size()) return Refuse<ssize_t>(E2BIG);
        memcpy(names.data() + used, attributes[i].name, length);
        used += length;
    }
    return Give({names.data(), used}, list, size);
}

ssize_t getxattr(const char* path, const char* name, void* value, size_t size) {
    const Attribute* const found = FindAttribute(path, name);
    if (found == nullptr) return Refuse<ssize_t>(ENODATA);
    return Give({found->value, found->size}, value, size);
}

int setxattr(const char* path, const char* name, const void* value, size_t size, int flags) {
    return Store(path, name, {static_cast<const std::uint8_t*>(value), size}, flags);
}

int removexattr(const char* path, const char* name) {
    Attribute* const found = FindAttribute(path, name);
    if (found == nullptr) return Refuse<int>(ENODATA);
    if (found != &attributes[--attribute_count]) *found = attributes[attribute_count];
    return 0;
}

int stat(const char* path, struct stat* info) {
    if (fstatat(AT_FDCWD, path, info, 0) == 0) return 0;
    char buffer[PATH_MAX];
    return errno != ENOTDIR ? -1 : fstatat(AT_FDCWD, Kept(path, buffer), info, 0);
}

FILE* fopen(const char* path, const char* mode) {
    char buffer[PATH_MAX];
    const bool plain = strchr(mode, '+') == nullptr;
    int flags = O_CLOEXEC | (!plain ? O_RDWR : *mode == 'r' ? O_RDONLY : O_WRONLY);
    if (*mode == 'w') flags |= O_CREAT | O_TRUNC;
    if (*mode == 'a') flags |= O_CREAT | O_APPEND;
    int fd = open(path, flags, 0666);
    if (fd < 0 && errno == ENOTDIR) fd = open(Kept(path, buffer), flags, 0666);
    FILE* const file = fd < 0 ? nullptr : fdopen(fd, mode);
    if (file == nullptr && fd >= 0) close(fd);
    return file;
}

void sync() {}

int system(const char* command) {
    std::string_view rest = command == nullptr ? "" : command;
    constexpr std::string_view kCopy = "/bin/cp -f ";
    if (!rest.starts_with(kCopy) || !rest.ends_with("' > /dev/null 2>&1")) {
        Fail("not a command of ours: %s", command);
    }
    const std::string_view from = Quoted(&rest);
    const std::string_view to = Quoted(&rest);
    char paths[2][PATH_MAX] = {};
    from.copy(paths[0], sizeof paths[0] - 1);
    to.copy(paths[1], sizeof paths[1] - 1);
    return CopyFile(paths[0], paths[1]) << 8;
}

int MAVOGetFSType(const char*, int) { return VolumeType(); }

int MLIBCExec(const char* program, ...) {
    const char* words[4] = {};
    std::size_t count = 0;
    va_list list;
    va_start(list, program);
    while (const char* const word = va_arg(list, const char*)) {
        if (count < std::size(words)) words[count] = word;
        ++count;
    }
    va_end(list);
    const auto is = [&](std::string_view name, std::string_view option, std::size_t size) {
        return program == name && count == size && words[0] == option;
    };
    if (is("/bin/cp", "-f", 3)) return CopyFile(words[1], words[2]);
    if (is("/bin/mv", "-f", 3)) return rename(words[1], words[2]) == 0 ? 0 : 1;
    if (program == std::string_view("/bin/mv") && count == 2) {
        return rename(words[0], words[1]) == 0 ? 0 : 1;
    }
    if (is("/bin/rm", "-rf", 2)) {
        RemoveAt(AT_FDCWD, words[1]);
        return 0;
    }
    Fail("not a program of ours: %s with %zu words", program, count);
}

}  // extern "C"

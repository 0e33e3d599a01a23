#include "tests/support/snapshot.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

namespace mavoea::test {
namespace {

[[noreturn]] void Die(const std::string& what) {
    fprintf(stderr, "test support: %s: %s\n", what.c_str(), strerror(errno));
    abort();
}

// O_NOATIME is for owners and the superuser; others must do without.
int OpenQuietly(const std::string& path, int flags) {
    const int fd = open(path.c_str(), flags | O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NOATIME);
    if (fd >= 0 || errno != EPERM) return fd;
    return open(path.c_str(), flags | O_RDONLY | O_NOFOLLOW | O_CLOEXEC);
}

std::string ContentsOf(const std::string& path) {
    const int fd = OpenQuietly(path, 0);
    if (fd < 0) Die(path);
    std::string contents;
    char part[65536];
    ssize_t size = 0;
    while ((size = read(fd, part, sizeof part)) > 0) {
        contents.append(part, static_cast<std::size_t>(size));
    }
    if (size < 0) Die(path);
    close(fd);
    return contents;
}

std::string TargetOf(const std::string& path) {
    char target[4096];
    const ssize_t size = readlink(path.c_str(), target, sizeof target);
    if (size < 0) Die(path);
    return {target, static_cast<std::size_t>(size)};
}

std::vector<std::string> NamesQuietly(const std::string& path) {
    const int fd = OpenQuietly(path, O_DIRECTORY);
    if (fd < 0) Die(path);
    DIR* const directory = fdopendir(fd);
    if (directory == nullptr) Die(path);
    std::vector<std::string> names;
    while (const dirent* const entry = readdir(directory)) {
        const std::string name = entry->d_name;
        if (name != "." && name != "..") names.push_back(name);
    }
    closedir(directory);
    std::sort(names.begin(), names.end());
    return names;
}

void AddAttributes(const std::string& path, Aspects* aspects) {
    std::string names(65536, '\0');
    const ssize_t size = llistxattr(path.c_str(), names.data(), names.size());
    if (size < 0 && errno != ENOTSUP) Die(path);
    std::string value(65536, '\0');
    const char* const end = names.data() + std::max<ssize_t>(size, 0);
    for (const char* name = names.data(); name < end; name += strlen(name) + 1) {
        const ssize_t length = lgetxattr(path.c_str(), name, value.data(), value.size());
        if (length < 0) Die(path + ": " + name);
        (*aspects)["xattr " + std::string(name)] =
            value.substr(0, static_cast<std::size_t>(length));
    }
}

const char* TypeName(unsigned mode) {
    switch (mode & S_IFMT) {
        case S_IFREG:
            return "file";
        case S_IFDIR:
            return "directory";
        case S_IFLNK:
            return "link";
        case S_IFIFO:
            return "pipe";
        default:
            return "special";
    }
}

std::string TimeText(const struct statx_timestamp& time) {
    char text[40];
    snprintf(text, sizeof text, "%lld.%09u", static_cast<long long>(time.tv_sec), time.tv_nsec);
    return text;
}

void Add(const std::string& path, const std::string& shown, Snapshot* snapshot) {
    struct statx info = {};
    if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS, &info) != 0) {
        Die(path);
    }
    Aspects& aspects = (*snapshot)[shown];
    aspects["type"] = TypeName(info.stx_mode);
    aspects["owner"] = std::to_string(info.stx_uid) + ':' + std::to_string(info.stx_gid);
    aspects["inode"] = std::to_string(info.stx_ino);
    aspects["links"] = std::to_string(info.stx_nlink);
    aspects["mtime"] = TimeText(info.stx_mtime);
    aspects["ctime"] = TimeText(info.stx_ctime);
    AddAttributes(path, &aspects);
    if (S_ISLNK(info.stx_mode)) {
        aspects["target"] = TargetOf(path);
        return;
    }
    char mode[8];
    snprintf(mode, sizeof mode, "%04o", info.stx_mode & 07777U);
    aspects["mode"] = mode;
    aspects["atime"] = TimeText(info.stx_atime);
    if (S_ISREG(info.stx_mode)) aspects["bytes"] = ContentsOf(path);
    if (!S_ISDIR(info.stx_mode)) return;
    for (const std::string& name : NamesQuietly(path)) {
        Add(path + '/' + name, shown == "." ? name : shown + '/' + name, snapshot);
    }
}

// Long values are told by their size and their beginning.
std::string Shown(const std::string& value) {
    constexpr std::size_t kMost = 32;
    std::string shown;
    for (const char c : value.substr(0, kMost)) {
        char digits[8];
        snprintf(digits, sizeof digits, c >= ' ' && c < 127 ? "%c" : "\\x%02X",
                 static_cast<unsigned>(static_cast<unsigned char>(c)));
        shown += digits;
    }
    return value.size() > kMost ? shown + "... of " + std::to_string(value.size()) + " bytes"
                                : shown;
}

const std::string& ValueIn(const Aspects& aspects, const std::string& aspect) {
    static const std::string& none = *new std::string("none");
    const auto found = aspects.find(aspect);
    return found == aspects.end() ? none : found->second;
}

}  // namespace

Snapshot TakeSnapshot(const std::string& top) {
    Snapshot snapshot;
    struct stat info = {};
    if (lstat(top.c_str(), &info) != 0 && errno == ENOENT) return snapshot;
    Add(top, ".", &snapshot);
    return snapshot;
}

std::vector<std::string> Differences(const Snapshot& before, const Snapshot& after,
                                     const std::set<std::string>& ignored) {
    std::vector<std::string> differences;
    for (const auto& [path, aspects] : before) {
        const auto now = after.find(path);
        if (now == after.end()) {
            differences.push_back(path + ": gone");
            continue;
        }
        std::set<std::string> names;
        for (const auto& [name, value] : aspects) names.insert(name);
        for (const auto& [name, value] : now->second) names.insert(name);
        const bool is_directory = ValueIn(aspects, "type") == "directory";
        for (const std::string& name : names) {
            if (ignored.contains(name)) continue;
            if (is_directory && ignored.contains(name + " of directories")) continue;
            const std::string& old_value = ValueIn(aspects, name);
            const std::string& new_value = ValueIn(now->second, name);
            if (old_value == new_value) continue;
            differences.push_back(path + ": " + name + ": " + Shown(old_value) + " -> " +
                                  Shown(new_value));
        }
    }
    for (const auto& [path, aspects] : after) {
        if (!before.contains(path)) differences.push_back(path + ": new");
    }
    return differences;
}

void SetOldTimes(const std::string& top) {
    std::vector<std::string> paths = {top};
    for (const auto& entry : std::filesystem::recursive_directory_iterator(top)) {
        paths.push_back(entry.path().string());
    }
    timespec times[2] = {};
    times[0].tv_sec = 1000000000;
    times[1].tv_sec = 1020000000;
    for (const std::string& path : paths) {
        if (utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW) != 0) Die(path);
    }
}

}  // namespace mavoea::test

#include "tools/directory.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <string_view>

#include "tools/messages.h"

namespace mavoea::tool {
namespace {

constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

}  // namespace

Directory Directory::Open(const std::string& path) {
    File file(::open(path.c_str(), kFlags), path);
    if (file.fd() < 0) throw SystemFailure(path, errno);
    return Directory(std::move(file));
}

std::optional<Directory> Directory::FindIn(const std::string& name) const {
    File file(::openat(file_.fd(), name.c_str(), kFlags), PathOf(name));
    if (file.fd() >= 0) return Directory(std::move(file));
    if (errno == ENOENT || errno == ENOTDIR || errno == ELOOP) return std::nullopt;
    throw SystemFailure(file.path(), errno);
}

std::string Directory::PathOf(const std::string& name) const {
    return path() == "/" ? '/' + name : path() + '/' + name;
}

std::vector<Directory::Entry> Directory::Entries() const {
    // Reading moves the position of a descriptor, so it takes one of its own.
    const int fd = ::openat(file_.fd(), ".", kFlags);
    if (fd < 0) throw SystemFailure(path(), errno);
    const std::unique_ptr<DIR, int (*)(DIR*)> dir(::fdopendir(fd), ::closedir);
    if (!dir) {
        const int error = errno;
        ::close(fd);
        throw SystemFailure(path(), error);
    }
    std::vector<Entry> entries;
    for (;;) {
        errno = 0;
        const dirent* const entry = ::readdir(dir.get());
        if (entry == nullptr) break;
        const std::string_view name = entry->d_name;
        if (name == "." || name == "..") continue;
        mode_t type = static_cast<mode_t>(DTTOIF(entry->d_type));
        if (entry->d_type == DT_UNKNOWN) {
            struct stat info;
            if (::fstatat(file_.fd(), entry->d_name, &info, AT_SYMLINK_NOFOLLOW) != 0) {
                if (errno == ENOENT) continue;
                throw SystemFailure(PathOf(entry->d_name), errno);
            }
            type = info.st_mode & S_IFMT;
        }
        entries.push_back({std::string(name), type});
    }
    if (errno != 0) throw SystemFailure(path(), errno);
    std::sort(entries.begin(), entries.end(),
              [](const Entry& one, const Entry& other) { return one.name < other.name; });
    return entries;
}

bool Directory::Has(const std::string& name) const {
    struct stat info;
    if (::fstatat(file_.fd(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0) return true;
    if (errno == ENOENT || errno == ENAMETOOLONG) return false;
    throw SystemFailure(PathOf(name), errno);
}

bool Directory::Remove(const std::string& name) const {
    if (::unlinkat(file_.fd(), name.c_str(), 0) == 0) return true;
    if (errno == ENOENT) return false;
    if (errno != EISDIR) throw SystemFailure(PathOf(name), errno);
    if (const auto directory = FindIn(name)) {
        for (const Entry& entry : directory->Entries()) (void)directory->Remove(entry.name);
    }
    if (::unlinkat(file_.fd(), name.c_str(), AT_REMOVEDIR) == 0) return true;
    if (errno == ENOENT) return false;
    throw SystemFailure(PathOf(name), errno);
}

bool Directory::RemoveEmpty(const std::string& name) const {
    if (::unlinkat(file_.fd(), name.c_str(), AT_REMOVEDIR) == 0) return true;
    if (errno == ENOENT || errno == ENOTEMPTY || errno == EEXIST) return false;
    throw SystemFailure(PathOf(name), errno);
}

}  // namespace mavoea::tool

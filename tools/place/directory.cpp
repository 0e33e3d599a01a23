#include "tools/place/directory.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <random>
#include <string_view>

#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr int kFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;

Failure NotThis(const std::string& path, const char* what) {
    return {kFailed, path, what, "see who put it there, and move it away"};
}

std::string ProcPathOf(int fd) { return "/proc/self/fd/" + std::to_string(fd); }

}  // namespace

// ---- Directory ----------------------------------------------------------------------------------

DirectoryRef Directory::Open(const std::string& path, const std::string& shown) {
    File file(::open(path.c_str(), kFlags), shown);
    if (file.fd() < 0) throw SystemFailure(shown, errno);
    return DirectoryRef(new Directory(std::move(file)));
}

DirectoryRef Directory::FindIn(const std::string& name) const {
    File file(::openat(fd(), name.c_str(), kFlags | O_NOFOLLOW), PathOf(name));
    if (file.fd() >= 0) return DirectoryRef(new Directory(std::move(file)));
    const int error = errno;
    if (error == ENOENT) return nullptr;
    const auto info = error == ENOTDIR || error == ELOOP ? StatusOf(name) : std::nullopt;
    if (info && S_ISLNK(info->st_mode)) {
        throw NotThis(PathOf(name), "a symbolic link in the place of a directory");
    }
    throw SystemFailure(PathOf(name), error);
}

DirectoryRef Directory::OpenIn(const std::string& name) const {
    if (DirectoryRef found = FindIn(name)) return found;
    throw SystemFailure(PathOf(name), ENOENT);
}

DirectoryRef Directory::FindAgain(const std::string& name) const {
    if (kept_ && kept_->path() == PathOf(name)) {
        const auto info = StatusOf(name);
        if (info && SameFile(*info, kept_->Status())) return kept_;
    }
    return kept_ = FindIn(name);
}

DirectoryRef Directory::MakeIn(const std::string& name) const {
    if (::mkdirat(fd(), name.c_str(), S_IRWXU) != 0) throw SystemFailure(PathOf(name), errno);
    DirectoryRef made = OpenIn(name);
    // Whoever may write here may have put another one in its place, which is not to be changed.
    const struct stat info = made->Status();
    if (info.st_uid != ::geteuid() || (info.st_mode & 0077) != 0) {
        throw NotThis(made->path(), "another directory has come where one was just made");
    }
    return made;
}

std::string Directory::PathOf(const std::string& name) const {
    if (name == ".") return path();
    return path() == "/" ? '/' + name : path() + '/' + name;
}

std::string Directory::ProcPath() const { return ProcPathOf(fd()); }
std::string Directory::ProcPath(const std::string& name) const { return ProcPath() + '/' + name; }

File Directory::Reopened() const {
    File file(OpenQuietly(fd(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC), path());
    if (file.fd() < 0) throw SystemFailure(path(), errno);
    return file;
}

std::vector<Directory::Entry> Directory::Entries() const {
    const int own = ::fcntl(Reopened().fd(), F_DUPFD_CLOEXEC, 0);
    const std::unique_ptr<DIR, int (*)(DIR*)> dir(own < 0 ? nullptr : ::fdopendir(own), ::closedir);
    if (!dir) {
        const int error = errno;
        if (own >= 0) ::close(own);
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
            const auto info = StatusOf(entry->d_name);
            if (!info) continue;
            type = info->st_mode & S_IFMT;
        }
        entries.push_back({std::string(name), type});
    }
    if (errno != 0) throw SystemFailure(path(), errno);
    std::sort(entries.begin(), entries.end(),
              [](const Entry& one, const Entry& other) { return one.name < other.name; });
    return entries;
}

const std::vector<Directory::Entry>& Directory::EntriesAtFirst() const {
    if (!first_) first_ = std::make_unique<std::vector<Entry>>(Entries());
    return *first_;
}

std::optional<struct stat> Directory::StatusOf(const std::string& name) const {
    struct stat info;
    if (::fstatat(fd(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0) return info;
    if (errno == ENOENT || errno == ENAMETOOLONG) return std::nullopt;
    throw SystemFailure(PathOf(name), errno);
}

std::shared_ptr<const File> Directory::FindFile(const std::string& name, int flags) const {
    // Never waits for the other end of a FIFO, or for whoever holds a lease.
    const int all = flags | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    auto file = std::make_shared<File>(OpenQuietly(fd(), name.c_str(), all), PathOf(name));
    if (file->fd() < 0) {
        const int error = errno;
        if (error == ENOENT || error == ENAMETOOLONG) return nullptr;
        if (error == ELOOP) throw NotThis(file->path(), "a symbolic link in the place of a file");
        if (error == EISDIR || error == ENXIO) throw NotThis(file->path(), "not a regular file");
        throw SystemFailure(file->path(), error);
    }
    if (!S_ISREG(file->Status().st_mode)) throw NotThis(file->path(), "not a regular file");
    return file;
}

bool Directory::RemoveFile(const std::string& name) const {
    if (::unlinkat(fd(), name.c_str(), 0) == 0) return true;
    if (errno == ENOENT) return false;
    throw SystemFailure(PathOf(name), errno);
}

bool Directory::Remove(const std::string& name) const {
    if (::unlinkat(fd(), name.c_str(), 0) == 0) return true;
    if (errno == ENOENT) return false;
    if (errno != EISDIR) throw SystemFailure(PathOf(name), errno);
    if (const DirectoryRef directory = FindIn(name)) {
        for (const Entry& entry : directory->Entries()) (void)directory->Remove(entry.name);
    }
    if (::unlinkat(fd(), name.c_str(), AT_REMOVEDIR) == 0) return true;
    if (errno == ENOENT) return false;
    throw SystemFailure(PathOf(name), errno);
}

bool Directory::RemoveEmpty(const std::string& name) const {
    if (::unlinkat(fd(), name.c_str(), AT_REMOVEDIR) == 0) return true;
    if (errno == ENOENT || errno == ENOTEMPTY || errno == EEXIST) return false;
    throw SystemFailure(PathOf(name), errno);
}

void Directory::Rename(const std::string& name, const Directory& to,
                       const std::string& new_name) const {
    if (::renameat(fd(), name.c_str(), to.fd(), new_name.c_str()) == 0) return;
    throw SystemFailure(PathOf(name), errno);
}

void Directory::Sync() const { Reopened().Sync(); }

void Directory::SyncVolume() const {
    if (::syncfs(Reopened().fd()) != 0) throw SystemFailure(path(), errno);
}

bool Place::Writable() const {
    const auto info = Status();
    return !info || S_ISLNK(info->st_mode) ||
           ::faccessat(directory->fd(), name.c_str(), W_OK, AT_EACCESS) == 0 || errno != EACCES;
}

struct stat StatusOf(const Place& place) {
    if (const auto info = place.Status()) return *info;
    throw SystemFailure(place.path(), ENOENT);
}

// ---- Inode --------------------------------------------------------------------------------------

std::shared_ptr<const Inode> Inode::Find(const Place& place) {
    constexpr int kInodeFlags = O_PATH | O_NOFOLLOW | O_CLOEXEC;
    File file(::openat(place.directory->fd(), place.name.c_str(), kInodeFlags), place.path());
    if (file.fd() < 0) {
        if (errno == ENOENT) return nullptr;
        throw SystemFailure(file.path(), errno);
    }
    const struct stat info = file.Status();
    return std::shared_ptr<const Inode>(new Inode(std::move(file), info));
}

std::shared_ptr<const Inode> Inode::Open(const Place& place) {
    if (auto found = Find(place)) return found;
    throw SystemFailure(place.path(), ENOENT);
}

std::shared_ptr<const Inode> Inode::Of(const File& file) {
    File own(::fcntl(file.fd(), F_DUPFD_CLOEXEC, 0), file.path());
    if (own.fd() < 0) throw SystemFailure(file.path(), errno);
    const struct stat info = own.Status();
    return std::shared_ptr<const Inode>(new Inode(std::move(own), info));
}

bool Inode::HoldsContents() const { return S_ISREG(info_.st_mode) || S_ISDIR(info_.st_mode); }

std::string Inode::ProcPath() const { return ProcPathOf(file_.fd()); }

std::vector<std::string> Inode::AttributeNames() const {
    const std::string at = ProcPath();
    std::vector<char> list;
    ssize_t size = ::listxattr(at.c_str(), nullptr, 0);
    while (size > 0) {
        list.resize(static_cast<std::size_t>(size));
        size = ::listxattr(at.c_str(), list.data(), list.size());
        if (size >= 0 || errno != ERANGE) break;
        size = ::listxattr(at.c_str(), nullptr, 0);
    }
    if (size < 0 && errno != ENOTSUP) throw SystemFailure(path(), errno);
    std::vector<std::string> names;
    const char* const end = list.data() + std::max<ssize_t>(size, 0);
    for (const char* name = list.data(); name < end; name += names.back().size() + 1) {
        names.emplace_back(name);
    }
    return names;
}

std::optional<Bytes> Inode::Attribute(const std::string& name) const {
    constexpr std::size_t kUsual = 512;
    const std::string at = ProcPath();
    Bytes value(kUsual);
    for (;;) {
        ssize_t size = ::getxattr(at.c_str(), name.c_str(), value.data(), value.size());
        if (size >= 0) {
            value.resize(static_cast<std::size_t>(size));
            return value;
        }
        if (errno == ENODATA || errno == ENOTSUP) return std::nullopt;
        if (errno != ERANGE) throw SystemFailure(path(), errno);
        size = ::getxattr(at.c_str(), name.c_str(), nullptr, 0);
        // It may have gone, or grown, in between.
        if (size > 0) value.resize(static_cast<std::size_t>(size));
    }
}

void Inode::SetAttribute(const std::string& name, ByteView value) const {
    if (::setxattr(ProcPath().c_str(), name.c_str(), value.data(), value.size(), 0) != 0) {
        throw SystemFailure(path(), errno);
    }
}

bool Inode::RemoveAttribute(const std::string& name) const {
    if (::removexattr(ProcPath().c_str(), name.c_str()) == 0) return true;
    if (errno == ENODATA || errno == ENOTSUP) return false;
    throw SystemFailure(path(), errno);
}

void Inode::SetMode(mode_t mode) const {
    if (::chmod(ProcPath().c_str(), mode) != 0) throw SystemFailure(path(), errno);
}

bool Inode::TrySetOwner(uid_t owner, gid_t group) const {
    return ::fchownat(file_.fd(), "", owner, group, AT_EMPTY_PATH) == 0;
}

void Inode::SetTimes(const timespec (&times)[2]) const {
    if (::utimensat(AT_FDCWD, ProcPath().c_str(), times, 0) != 0 && errno != EPERM) {
        throw SystemFailure(path(), errno);
    }
}

// ---- Temporary files ----------------------------------------------------------------------------

std::string TemporaryName() {
    static std::random_device random;
    constexpr std::string_view kLetters = "abcdefghijklmnopqrstuvwxyz0123456789";
    std::uniform_int_distribution<std::size_t> letter(0, kLetters.size() - 1);
    std::string text = ".mavoea-";
    for (int i = 0; i < 8; ++i) text += kLetters[letter(random)];
    return text;
}

TemporaryFile::TemporaryFile(const Place& target)
    : target_(target), file_([&] {
          constexpr int kAttempts = 100;
          constexpr int kMake = O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
          for (int attempt = 1;; ++attempt) {
              name_ = TemporaryName();
              const int fd =
                  ::openat(target.directory->fd(), name_.c_str(), kMake, S_IRUSR | S_IWUSR);
              if (fd >= 0) return File(fd, target.path());
              if (errno != EEXIST || attempt == kAttempts) {
                  throw SystemFailure(target.path(), errno);
              }
          }
      }()) {}

TemporaryFile::~TemporaryFile() {
    if (made_) (void)::unlinkat(target_.directory->fd(), name_.c_str(), 0);
}

void TemporaryFile::GiveToTarget() {
    target_.directory->Rename(name_, *target_.directory, target_.name);
    made_ = false;
    RequireTarget();
}

void TemporaryFile::GiveToNewTarget() {
    const int fd = target_.directory->fd();
    if (::linkat(fd, name_.c_str(), fd, target_.name.c_str(), 0) == 0) {
        (void)::unlinkat(fd, name_.c_str(), 0);
    } else if (errno != EPERM && errno != ENOTSUP) {
        throw SystemFailure(target_.path(), errno);
    } else if (target_.Status()) {  // a file system without links
        throw SystemFailure(target_.path(), EEXIST);
    } else {
        target_.directory->Rename(name_, *target_.directory, target_.name);
    }
    made_ = false;
    RequireTarget();
}

void TemporaryFile::RequireTarget() const {
    const auto there = target_.Status();
    if (there && SameFile(*there, file_.Status())) return;
    throw NotThis(target_.path(), "another file has come where one was just made");
}

void RequireDescriptorPaths() {
    struct stat info;
    if (::geteuid() != 0 || ::stat("/proc/self/fd", &info) == 0) return;
    throw Failure(kFailed, "/proc",
                  "it is not mounted: a tree is not safe from its users without it",
                  "mount it, or work as another user than root");
}

}  // namespace mavoea::tool

#include "tools/place/directory.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/random.h>
#include <sys/syscall.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <ctime>
#include <memory>
#include <string_view>

#include "tools/place/dry_run.h"
#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr int kFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;

Failure NotThis(const std::string& path, const char* what) {
    return {kFailed, path, what, "see who put it there, and move it away"};
}

// The lock of a file that one process at a time works on. Nobody waits for it; where there are no
// such locks, everybody has it.
bool TryToLock(int fd) { return ::flock(fd, LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK; }

constexpr std::string_view kLetters = "abcdefghijklmnopqrstuvwxyz0123456789";
constexpr std::size_t kLetterCount = 8;

bool IsAscii(const std::string& name) {
    return std::all_of(name.begin(), name.end(),
                       [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

std::string OtherCase(std::string name) {
    for (char& c : name) {
        const bool letter = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
        if (letter) c = static_cast<char>(c ^ ('a' ^ 'A'));
    }
    return name;
}

// The first of the sorted entries that does not come before that name.
template <class Entries>
auto FirstFrom(Entries& entries, const std::string& name) {
    return std::lower_bound(entries.begin(), entries.end(), name,
                            [](const Directory::Entry& entry, const std::string& wanted) {
                                return entry.name < wanted;
                            });
}

// listxattrat(2), which Linux has from 6.13 on. Kernels without it say ENOSYS, sandboxes EPERM.
#if defined(SYS_listxattrat)
constexpr long kListXattrAt = SYS_listxattrat;
#elif defined(__alpha__) || defined(__mips__) || (defined(__x86_64__) && defined(__ILP32__))
constexpr long kListXattrAt = -1;  // numbers of their own
#else
constexpr long kListXattrAt = 465;
#endif

std::string ProcPathOf(int fd) { return "/proc/self/fd/" + std::to_string(fd); }

void AddTo(std::string* path, const std::string& name) {
    if (name == ".") return;
    if (!path->empty() && path->back() != '/') path->push_back('/');
    *path += name;
}

}  // namespace

// ---- Directory ----------------------------------------------------------------------------------

DirectoryRef Directory::Open(const std::string& path, const std::string& shown,
                             const std::string& location) {
    const int fd = ::open(path.c_str(), kFlags);
    if (fd < 0) throw SystemFailure(path, errno);
    const Names names = {nullptr, {}, shown, std::make_shared<const std::string>(location)};
    return DirectoryRef(new Directory(fd, std::make_shared<Names>(names)));
}

DirectoryRef Directory::Adopt(int fd, const std::string& shown, const std::string& location,
                              bool has_location, bool is_new) {
    const Names names = {
        nullptr, {}, shown, std::make_shared<const std::string>(location), has_location};
    DirectoryRef adopted(new Directory(fd, std::make_shared<Names>(names)));
    if (is_new) adopted->BeginEmpty();
    return adopted;
}

void Directory::BeginEmpty() const {
    is_new_ = true;
    first_ = std::make_unique<std::vector<Entry>>();
}

// One after the other: those of a deep tree would take the whole stack.
Directory::Names::~Names() {
    std::shared_ptr<Names> next = std::move(above);
    while (next && next.use_count() == 1) next = std::shared_ptr<Names>(std::move(next->above));
}

std::shared_ptr<Directory::Names> Directory::NamesOf(const std::string& name,
                                                     const std::string& shown) const {
    const bool has_location = HasLocation(name);
    const Names names = {
        names_, name, shown,
        has_location ? std::make_shared<const std::string>(LocationOf(name)) : names_->location,
        has_location};
    return std::make_shared<Names>(names);
}

DirectoryRef Directory::FindIn(const std::string& name) const { return FindIn(name, {}); }

// One that is not there, or would have another place.
DirectoryRef Directory::Foresee(const std::string& name, const std::string& shown,
                                const struct stat& info) const {
    const std::shared_ptr<Directory> foreseen(new Directory(-1, NamesOf(name, shown)));
    foreseen->on_disk_ = OnDisk().shared_from_this();
    foreseen->foreseen_info_ = info;
    return foreseen;
}

DirectoryRef Directory::FindIn(const std::string& name, const std::string& shown) const {
    if (const auto* const entry = Foreseen::Find(*this, name); entry != nullptr || foreseen()) {
        if (entry == nullptr || !entry->info) return nullptr;
        if (S_ISDIR(entry->info->st_mode)) return Foresee(name, shown, *entry->info);
        const std::string path = shown.empty() ? PathOf(name) : shown;
        if (!S_ISLNK(entry->info->st_mode)) throw SystemFailure(path, ENOTDIR);
        throw NotThis(path, "a symbolic link in the place of a directory");
    }
    const int fd = ::openat(this->fd(), name.c_str(), kFlags | O_NOFOLLOW);
    if (fd >= 0) return DirectoryRef(new Directory(fd, NamesOf(name, shown)));
    const int error = errno;
    if (error == ENOENT) return nullptr;
    const auto info = error == ENOTDIR || error == ELOOP ? StatusOf(name) : std::nullopt;
    const std::string path = shown.empty() ? PathOf(name) : shown;
    if (info && S_ISLNK(info->st_mode)) {
        throw NotThis(path, "a symbolic link in the place of a directory");
    }
    throw SystemFailure(path, error);
}

DirectoryRef Directory::OpenIn(const std::string& name) const { return OpenIn(name, {}); }

DirectoryRef Directory::OpenIn(const std::string& name, const std::string& shown) const {
    if (DirectoryRef found = FindIn(name, shown)) return found;
    throw SystemFailure(shown.empty() ? PathOf(name) : shown, ENOENT);
}

DirectoryRef Directory::OpenAbove(const struct stat& former) const {
    const int fd = ::openat(this->fd(), "..", kFlags);
    if (fd < 0) throw SystemFailure(path(), errno);
    DirectoryRef above(new Directory(fd, names_->above));
    if (SameFile(above->Status(), former)) return above;
    throw Failure(kFailed, path(), "it has been moved into another directory meanwhile",
                  "give the command again");
}

DirectoryRef Directory::FindAgain(const std::string& name) const {
    if (kept_ && kept_->names_->name == name) {
        if (listed()) return kept_;
        const auto info = StatusOf(name);
        if (info && SameFile(*info, kept_->Status())) return kept_;
    }
    DirectoryRef found = MayHave(name) ? FindIn(name) : nullptr;
    // One that is foreseen may hold this one.
    kept_ = found && found->foreseen() ? nullptr : found;
    return found;
}

void Directory::Forget(const std::string& name) const {
    if (kept_ && kept_->names_->name == name) kept_ = nullptr;
}

DirectoryRef Directory::LockIn(const std::string& name, bool* busy) const {
    constexpr int kLockFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
    const int fd = ::openat(this->fd(), name.c_str(), kLockFlags);
    if (fd < 0) {
        if (errno == ENOENT) return nullptr;
        throw SystemFailure(PathOf(name), errno);
    }
    DirectoryRef directory(new Directory(fd, NamesOf(name, {})));
    if (TryToLock(fd)) return directory;
    *busy = true;
    return nullptr;
}

DirectoryRef Directory::MakeIn(const std::string& name, mode_t mode) const {
    constexpr mode_t kRights = S_IRWXU | S_IRWXG | S_IRWXO;
    if (DryRun()) {
        const int error = Has(name) ? EEXIST : WhyNoNewFile(*this);
        if (error != 0) throw SystemFailure(PathOf(name), error);
        const struct stat info = Foreseen::StatusOfNew(*this, S_IFDIR | mode);
        Foreseen::Come({shared_from_this(), name}, info);
        DirectoryRef made = Foresee(name, {}, info);
        made->BeginEmpty();
        return made;
    }
    if (::mkdirat(fd(), name.c_str(), mode) != 0) throw SystemFailure(PathOf(name), errno);
    DirectoryRef made = OpenIn(name);
    // Whoever may write here may have put another one in its place, which is not to be changed.
    const struct stat info = made->Status();
    if (info.st_uid != ::geteuid() || (info.st_mode & kRights & ~mode) != 0) {
        throw NotThis(made->path(), "another directory has come where one was just made");
    }
    made->BeginEmpty();
    NoteCome(name);
    return made;
}

std::string Directory::PathOf(const std::string& name) const {
    std::vector<const std::string*> below;
    constexpr std::size_t kUsual = 16;
    below.reserve(kUsual);
    below.push_back(&name);
    const Names* names = names_.get();
    std::size_t size = name.size();
    for (; names->above && names->shown.empty(); names = names->above.get()) {
        below.push_back(&names->name);
        size += 1 + names->name.size();
    }
    std::string path;
    path.reserve(names->shown.size() + 1 + size);
    path = names->shown;
    for (auto one = below.rbegin(); one != below.rend(); ++one) AddTo(&path, **one);
    return path;
}

std::string Directory::LocationOf(const std::string& name) const {
    std::string location = *names_->location;
    if (HasLocation(name)) AddTo(&location, name);
    return location;
}

bool Directory::HasLocation(const std::string& name) const {
    return names_->has_location && names_->location->size() + 1 + name.size() < PATH_MAX;
}

struct stat Directory::Status() const {
    if (foreseen()) return foreseen_info_;
    struct stat info;
    if (::fstat(fd(), &info) != 0) throw SystemFailure(path(), errno);
    return info;
}

std::string Directory::ProcPath() const { return ProcPathOf(fd()); }
std::string Directory::ProcPath(const std::string& name) const { return ProcPath() + '/' + name; }

int Directory::OpenToRead() const {
    const int own = OpenQuietly(fd(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (own < 0) throw SystemFailure(path(), errno);
    return own;
}

File Directory::Reopened() const { return {OpenToRead(), path()}; }

std::vector<Directory::Entry> Directory::Entries() const {
    std::vector<Entry> entries;
    if (!foreseen()) entries = EntriesOnDisk();
    if (const auto* const foreseen = Foreseen::In(*this)) {
        std::erase_if(entries, [&](const Entry& entry) { return foreseen->contains(entry.name); });
        for (const auto& [name, entry] : *foreseen) {
            if (entry.info) entries.push_back({name, entry.info->st_mode & S_IFMT});
        }
    }
    std::sort(entries.begin(), entries.end(),
              [](const Entry& one, const Entry& other) { return one.name < other.name; });
    return entries;
}

std::vector<Directory::Entry> Directory::EntriesOnDisk() const {
    const int own = OpenToRead();
    const std::unique_ptr<DIR, int (*)(DIR*)> dir(::fdopendir(own), ::closedir);
    if (!dir) {
        const int error = errno;
        ::close(own);
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
    return entries;
}

const std::vector<Directory::Entry>& Directory::EntriesAtFirst() const {
    if (!first_) first_ = std::make_unique<std::vector<Entry>>(Entries());
    return *first_;
}

mode_t Directory::TypeAtFirst(const std::string& name) const {
    const Entry* const entry = FirstOf(name);
    return entry == nullptr ? 0 : entry->type;
}

std::vector<std::string> Directory::NamesAtFirst(const std::string& prefix) const {
    std::set<std::string> names;
    const std::vector<Entry>& all = EntriesAtFirst();
    for (auto entry = FirstFrom(all, prefix); entry != all.end() && entry->name.starts_with(prefix);
         ++entry) {
        names.insert(entry->name);
    }
    for (auto name = later_.lower_bound(prefix); name != later_.end() && name->starts_with(prefix);
         ++name) {
        names.insert(*name);
    }
    return {names.begin(), names.end()};
}

bool Directory::MayHave(const std::string& name) const { return ListTells(name).value_or(true); }

bool Directory::HadAtFirst(const std::string& name) const {
    const auto tells = ListTells(name);
    return tells ? *tells : Has(name);
}

// None where there is no list, and for what could be there under a name that is listed otherwise:
// in other letters, or another form of the same ones.
std::optional<bool> Directory::ListTells(const std::string& name) const {
    if (!listed()) return std::nullopt;
    if (Lists(name)) return true;
    if (first_->empty() && later_.empty()) return false;
    if (TellsApart(name)) return false;
    return std::nullopt;
}

bool Directory::TellsApart(const std::string& name) const {
    return listed() && IsAscii(name) && (OtherCase(name) == name || TellsCasesApart());
}

bool Directory::Lists(const std::string& name) const {
    return FirstOf(name) != nullptr || later_.contains(name);
}

// Null where it was not there, or nobody has asked.
Directory::Entry* Directory::FirstOf(const std::string& name) const {
    if (!listed()) return nullptr;
    const auto found = FirstFrom(*first_, name);
    return found != first_->end() && found->name == name ? &*found : nullptr;
}

void Directory::NoteMetadata(const std::string& name) const {
    if (Entry* const entry = FirstOf(name)) entry->noted_as_metadata = true;
}

bool Directory::IsNotedAsMetadata(const std::string& name) const {
    const Entry* const entry = FirstOf(name);
    return entry != nullptr && entry->noted_as_metadata;
}

// Found out once, by a name that is there, in the other case.
bool Directory::TellsCasesApart() const {
    if (tells_cases_apart_) return *tells_cases_apart_;
    const auto try_name = [this](const std::string& name) {
        const std::string other = OtherCase(name);
        if (!IsAscii(name) || Lists(other) || !Has(name)) return false;
        tells_cases_apart_ = !Has(other);
        return true;
    };
    const bool tried = std::any_of(first_->begin(), first_->end(),
                                   [&](const Entry& entry) { return try_name(entry.name); }) ||
                       std::any_of(later_.begin(), later_.end(), try_name);
    if (!tried) tells_cases_apart_ = false;  // nobody can tell
    return *tells_cases_apart_;
}

void Directory::NoteCome(const std::string& name) const {
    if (listed() && !Lists(name)) later_.insert(name);
}

std::optional<struct stat> Directory::StatusOf(const std::string& name) const {
    if (const auto* const entry = Foreseen::Find(*this, name)) return entry->info;
    if (foreseen()) return std::nullopt;
    struct stat info;
    if (::fstatat(fd(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0) return info;
    if (errno == ENOENT || errno == ENAMETOOLONG) return std::nullopt;
    throw SystemFailure(PathOf(name), errno);
}

bool Directory::HasWithoutAttributes(const std::string& name) const {
    if (foreseen() || Foreseen::Find(*this, name) != nullptr) return false;
    static bool has_call = true;
    if (has_call) {
        const long size =
            ::syscall(kListXattrAt, fd(), name.c_str(), AT_SYMLINK_NOFOLLOW, nullptr, 0UL);
        if (size >= 0 || (errno != ENOSYS && errno != EPERM)) return size == 0;
        has_call = false;
    }
    return ::llistxattr(ProcPath(name).c_str(), nullptr, 0) == 0;
}

std::string Directory::NameOf(const struct stat& info, const std::string& name) const {
    std::string found = name;
    for (const Entry& entry : Entries()) {
        if (entry.name == name) return name;
        const auto other = StatusOf(entry.name);
        if (other && SameFile(*other, info)) found = entry.name;
    }
    return found;
}

std::shared_ptr<const File> Directory::FindFile(const std::string& name, int flags) const {
    if (const auto* const entry = Foreseen::Find(*this, name); entry != nullptr || foreseen()) {
        return entry == nullptr ? nullptr : entry->Open(flags);
    }
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
    if (DryRun()) {
        const int error = WhyNoRemoval({shared_from_this(), name});
        if (error == ENOENT) return false;
        if (error != 0) throw SystemFailure(PathOf(name), error);
        return true;
    }
    if (::unlinkat(fd(), name.c_str(), 0) == 0) return true;
    if (errno == ENOENT) return false;
    throw SystemFailure(PathOf(name), errno);
}

bool Directory::Remove(const std::string& name) const {
    if (DryRun()) return RemoveFile(name);
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
    if (DryRun()) return false;
    if (::unlinkat(fd(), name.c_str(), AT_REMOVEDIR) == 0) {
        Forget(name);
        return true;
    }
    if (errno == ENOENT || errno == ENOTEMPTY || errno == EEXIST) return false;
    throw SystemFailure(PathOf(name), errno);
}

void Directory::Rename(const std::string& name, const Directory& to,
                       const std::string& new_name) const {
    if (DryRun()) {
        const int error = WhyNoRemoval({shared_from_this(), name});
        if (error != 0) throw SystemFailure(PathOf(name), error);
        return;
    }
    if (::renameat(fd(), name.c_str(), to.fd(), new_name.c_str()) == 0) {
        return to.NoteCome(new_name);
    }
    throw SystemFailure(PathOf(name), errno);
}

bool Directory::RenameToNew(const std::string& name, const Directory& to,
                            const std::string& new_name) const {
    if (DryRun()) {
        if (to.Has(new_name)) return false;
        Rename(name, to, new_name);
        return true;
    }
    if (::renameat2(fd(), name.c_str(), to.fd(), new_name.c_str(), RENAME_NOREPLACE) == 0) {
        return true;
    }
    if (errno == EEXIST) return false;
    if (errno != EINVAL && errno != ENOSYS) throw SystemFailure(PathOf(name), errno);
    if (to.Has(new_name)) return false;  // a file system that cannot look and rename in one step
    Rename(name, to, new_name);
    return true;
}

void Directory::Sync() const {
    if (!DryRun()) Reopened().Sync();
}

void Directory::SyncVolume() const {
    if (DryRun()) return;
    if (::syncfs(Reopened().fd()) != 0) throw SystemFailure(path(), errno);
}

bool Place::Writable() const {
    if (::faccessat(directory->fd(), name.c_str(), W_OK, AT_EACCESS) == 0) return true;
    if (errno != EACCES) return true;
    const auto info = Status();
    return !info || S_ISLNK(info->st_mode);
}

struct stat StatusOf(const Place& place) {
    if (const auto info = place.Status()) return *info;
    throw SystemFailure(place.path(), ENOENT);
}

std::uint64_t BirthOf(const Place& place) {
    constexpr std::uint64_t kSecond = 1'000'000'000;
    if (Foreseen::Find(*place.directory, place.name) != nullptr) return 0;
    struct statx info;
    if (::statx(place.directory->fd(), place.name.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BTIME,
                &info) != 0) {
        if (errno == ENOENT) throw SystemFailure(place.path(), errno);
        return 0;
    }
    if ((info.stx_mask & STATX_BTIME) == 0) return 0;
    return static_cast<std::uint64_t>(info.stx_btime.tv_sec) * kSecond + info.stx_btime.tv_nsec;
}

bool IsListed(const Place& place) {
    const auto entries = place.directory->Entries();
    return std::any_of(entries.begin(), entries.end(),
                       [&](const auto& entry) { return entry.name == place.name; });
}

Failure HasBecomeAnother(const Place& place) {
    return {kFailed, place.path(), "it has become another file", "try again"};
}

// ---- Inode --------------------------------------------------------------------------------------

std::shared_ptr<const Inode> Inode::Foresee(const Place& place, const struct stat& info) {
    const Directory& around = place.directory->OnDisk();
    auto file = std::make_shared<const File>(
        ::openat(around.fd(), ".", O_PATH | O_DIRECTORY | O_CLOEXEC), place.path());
    if (file->fd() < 0) throw SystemFailure(place.path(), errno);
    return std::shared_ptr<const Inode>(new Inode(std::move(file), info));
}

std::shared_ptr<const Inode> Inode::Find(const Place& place) {
    if (const auto* const entry = Foreseen::Find(*place.directory, place.name);
        entry != nullptr || place.directory->foreseen()) {
        if (entry == nullptr || !entry->info) return nullptr;
        return Foresee(place, *entry->info);
    }
    constexpr int kInodeFlags = O_PATH | O_NOFOLLOW | O_CLOEXEC;
    auto file = std::make_shared<const File>(
        ::openat(place.directory->fd(), place.name.c_str(), kInodeFlags), place.path());
    if (file->fd() < 0) {
        if (errno == ENOENT) return nullptr;
        throw SystemFailure(file->path(), errno);
    }
    return std::shared_ptr<const Inode>(new Inode(std::move(file), true));
}

std::shared_ptr<const Inode> Inode::Open(const Place& place) {
    if (auto found = Find(place)) return found;
    throw SystemFailure(place.path(), ENOENT);
}

std::shared_ptr<const Inode> Inode::OpenToRead(const Place& place) {
    if (Foreseen::Find(*place.directory, place.name) != nullptr) return Open(place);
    // Never waits for the other end of a FIFO, or for whoever holds a lease.
    constexpr int kReadFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    const auto file = std::make_shared<const File>(
        OpenQuietly(place.directory->fd(), place.name.c_str(), kReadFlags), place.path());
    if (file->fd() < 0) return Open(place);
    auto inode = Of(file);
    return S_ISREG(inode->info().st_mode) ? inode : Open(place);
}

std::shared_ptr<const Inode> Inode::Of(const std::shared_ptr<const File>& file) {
    // What would wait for somebody is not opened in a dry run.
    const bool by_path = DryRun() && (::fcntl(file->fd(), F_GETFL) & O_PATH) != 0;
    return std::shared_ptr<const Inode>(new Inode(file, by_path));
}

std::shared_ptr<const Inode> Inode::Of(const File& file) {
    const auto own =
        std::make_shared<const File>(::fcntl(file.fd(), F_DUPFD_CLOEXEC, 0), file.path());
    if (own->fd() < 0) throw SystemFailure(file.path(), errno);
    return Of(own);
}

bool Inode::HoldsContents() const { return S_ISREG(info_.st_mode) || S_ISDIR(info_.st_mode); }

std::string Inode::ProcPath() const { return ProcPathOf(file_->fd()); }

std::vector<std::string> Inode::AttributeNames() const {
    if (foreseen_) return {};
    constexpr std::size_t kUsual = 1024;
    const auto read = [this](char* list, std::size_t size) {
        return by_path_ ? ::listxattr(ProcPath().c_str(), list, size)
                        : ::flistxattr(file_->fd(), list, size);
    };
    std::vector<char> list(kUsual);
    ssize_t size = read(list.data(), list.size());
    while (size < 0 && errno == ERANGE) {
        size = read(nullptr, 0);
        if (size <= 0) break;
        list.resize(static_cast<std::size_t>(size));
        size = read(list.data(), list.size());
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
    const auto read = [&](void* value, std::size_t size) {
        return by_path_ ? ::getxattr(ProcPath().c_str(), name.c_str(), value, size)
                        : ::fgetxattr(file_->fd(), name.c_str(), value, size);
    };
    if (const auto* const rehearsed = Rehearsed::Find(*this, name)) return *rehearsed;
    if (foreseen_) return std::nullopt;
    Bytes value(kUsual);
    for (;;) {
        ssize_t size = read(value.data(), value.size());
        if (size >= 0) {
            value.resize(static_cast<std::size_t>(size));
            return value;
        }
        if (errno == ENODATA || errno == ENOTSUP) return std::nullopt;
        if (errno != ERANGE) throw SystemFailure(path(), errno);
        size = read(nullptr, 0);
        // It may have gone, or grown, in between.
        if (size > 0) value.resize(static_cast<std::size_t>(size));
    }
}

void Inode::SetAttribute(const std::string& name, ByteView value) const {
    if (DryRun() || foreseen_) {
        const int error = DryRun() ? WhyNoAttribute(*this, name, value.size()) : 0;
        if (error != 0) throw SystemFailure(path(), error);
        if (!Rehearsed::HasRoom(*this, name, value.size())) throw SystemFailure(path(), ENOSPC);
        return Rehearsed::Note(*this, name, Bytes(value.begin(), value.end()));
    }
    const int result =
        by_path_ ? ::setxattr(ProcPath().c_str(), name.c_str(), value.data(), value.size(), 0)
                 : ::fsetxattr(file_->fd(), name.c_str(), value.data(), value.size(), 0);
    if (result != 0) throw SystemFailure(path(), errno);
}

bool Inode::RemoveAttribute(const std::string& name) const {
    if (DryRun() || foreseen_) {
        if (!Attribute(name)) return false;
        const int error = DryRun() ? WhyNoAttribute(*this, name, 0) : 0;
        if (error != 0) throw SystemFailure(path(), error);
        Rehearsed::Note(*this, name, std::nullopt);
        return true;
    }
    const int result = by_path_ ? ::removexattr(ProcPath().c_str(), name.c_str())
                                : ::fremovexattr(file_->fd(), name.c_str());
    if (result == 0) return true;
    if (errno == ENODATA || errno == ENOTSUP) return false;
    throw SystemFailure(path(), errno);
}

void Inode::SetMode(mode_t mode) const {
    if (DryRun()) {
        if (const int error = WhyNoMode(*this)) throw SystemFailure(path(), error);
        return;
    }
    const int result = by_path_ ? ::chmod(ProcPath().c_str(), mode) : ::fchmod(file_->fd(), mode);
    if (result != 0) throw SystemFailure(path(), errno);
}

bool Inode::TrySetOwner(uid_t owner, gid_t group) const {
    if (DryRun()) return true;
    return ::fchownat(file_->fd(), "", owner, group, AT_EMPTY_PATH) == 0;
}

void Inode::SetTimes(const timespec (&times)[2]) const {
    if (DryRun()) return;
    const int result = by_path_ ? ::utimensat(AT_FDCWD, ProcPath().c_str(), times, 0)
                                : ::futimens(file_->fd(), times);
    if (result != 0 && errno != EPERM) throw SystemFailure(path(), errno);
}

void Inode::Sync() const {
    if (DryRun()) return;
    if (!by_path_) return file_->Sync();
    const File opened(::open(ProcPath().c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC),
                      path());
    if (opened.fd() < 0) throw SystemFailure(path(), errno);
    opened.Sync();
}

// ---- Temporary files ----------------------------------------------------------------------------

std::string TemporaryName() {
    std::array<std::uint8_t, kLetterCount> random{};
    // Names that are taken are no harm: another one is tried.
    [[maybe_unused]] const ssize_t filled =
        ::getrandom(random.data(), random.size(), GRND_NONBLOCK);
    std::string text(kOwnPrefix);
    for (const std::uint8_t byte : random) text += kLetters[byte % kLetters.size()];
    return text;
}

bool IsTemporaryName(std::string_view name) {
    return name.size() == kOwnPrefix.size() + kLetterCount && name.starts_with(kOwnPrefix) &&
           name.find_first_not_of(kLetters, kOwnPrefix.size()) == std::string_view::npos;
}

namespace {

// Calls `work` while nobody else can lock what has been left, and returns what that does.
template <class Work>
bool WithAbandoned(const Directory& directory, const std::string& name, Work work) {
    constexpr time_t kLong = 60;  // seconds
    const auto info = directory.StatusOf(name);
    if (!info || S_ISDIR(info->st_mode)) return false;
    if (!S_ISREG(info->st_mode) || info->st_nlink > 1) {
        return info->st_ctime + kLong < ::time(nullptr) && work();
    }
    const auto file = directory.FindFile(name, O_RDONLY);
    return file && TryToLock(file->fd()) && work();
}

}  // namespace

bool IsAbandoned(const Directory& directory, const std::string& name) {
    return WithAbandoned(directory, name, [] { return true; });
}

bool RemoveAbandoned(const Directory& directory, const std::string& name) {
    return WithAbandoned(directory, name, [&] { return directory.RemoveFile(name); });
}

// Calls `use` with one temporary name after the other, until it returns true; it returns false with
// errno.
template <class Use>
void TemporaryFile::TryNames(Use use) const {
    constexpr int kAttempts = 100;
    for (int attempt = 1; !use(TemporaryName()); ++attempt) {
        if (errno != EEXIST || attempt == kAttempts) throw SystemFailure(target_.path(), errno);
    }
}

TemporaryFile::TemporaryFile(const Place& target, mode_t mode) : target_(target) {
    if (DryRun()) {
        MakeInMemory(mode);
        return;
    }
    if (MakeNameless(mode)) return;
    TryNames([&](const std::string& name) {
        constexpr int kMake = O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
        const int fd = ::openat(target_.directory->fd(), name.c_str(), kMake, mode);
        if (fd < 0) return false;
        file_ = std::make_shared<const File>(fd, target_.path());
        // Before it was locked somebody may have taken it for one that is left over.
        if (!TryToLock(fd) || file_->Status().st_nlink == 0) {
            errno = EEXIST;
            return false;
        }
        name_ = name;
        return true;
    });
}

TemporaryFile::~TemporaryFile() {
    if (!name_.empty()) (void)::unlinkat(target_.directory->fd(), name_.c_str(), 0);
}

void TemporaryFile::GiveToTarget() {
    if (DryRun()) {
        const int error = target_.Status() ? WhyNoRemoval(target_) : 0;
        if (error != 0) throw SystemFailure(target_.path(), error);
        return Foreseen::Come(target_, file_);
    }
    if (name_.empty()) {
        if (LinkTo(target_.name)) return target_.directory->NoteCome(target_.name);
        if (errno != EEXIST) throw SystemFailure(target_.path(), errno);
        NeedName();
    }
    target_.directory->Rename(name_, *target_.directory, target_.name);
    name_.clear();
    RequireTarget();
}

void TemporaryFile::GiveToNewTarget() {
    if (DryRun()) {
        if (target_.Status()) throw SystemFailure(target_.path(), EEXIST);
        return Foreseen::Come(target_, file_);
    }
    if (name_.empty()) {
        if (LinkTo(target_.name)) return target_.directory->NoteCome(target_.name);
        throw SystemFailure(target_.path(), errno);
    }
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
    name_.clear();
    target_.directory->NoteCome(target_.name);
    RequireTarget();
}

// For a dry run, so that what would be written can be looked at.
void TemporaryFile::MakeInMemory(mode_t mode) {
    if (const int error = WhyNoNewFile(*target_.directory)) {
        throw SystemFailure(target_.path(), error);
    }
    file_ = std::make_shared<const File>(::memfd_create("mavoea", MFD_CLOEXEC), target_.path());
    if (file_->fd() < 0 || ::fchmod(file_->fd(), mode) != 0) {
        throw SystemFailure(target_.path(), errno);
    }
}

// False where the file system, or the kernel, has no such files.
bool TemporaryFile::MakeNameless(mode_t mode) {
    constexpr int kMake = O_RDWR | O_TMPFILE | O_CLOEXEC;
    const int fd = ::openat(target_.directory->fd(), ".", kMake, mode);
    if (fd < 0) {
        if (errno == EOPNOTSUPP || errno == EISDIR || errno == EINVAL) return false;
        throw SystemFailure(target_.path(), errno);
    }
    file_ = std::make_shared<const File>(fd, target_.path());
    return true;
}

// Gives a file without a name its first one. False with errno, EEXIST when that is taken.
bool TemporaryFile::LinkTo(const std::string& name) const {
    const int fd = target_.directory->fd();
    if (::linkat(file_->fd(), "", fd, name.c_str(), AT_EMPTY_PATH) == 0) return true;
    if (errno != ENOENT) return false;
    // That takes a privilege; a path does not.
    const std::string path = ProcPathOf(file_->fd());
    return ::linkat(AT_FDCWD, path.c_str(), fd, name.c_str(), AT_SYMLINK_FOLLOW) == 0;
}

// Only what has a name can replace something.
void TemporaryFile::NeedName() {
    (void)TryToLock(file_->fd());
    TryNames([this](const std::string& name) {
        if (!LinkTo(name)) return false;
        name_ = name;
        return true;
    });
}

void TemporaryFile::RequireTarget() const {
    const auto there = target_.Status();
    if (there && SameFile(*there, file_->Status())) return;
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

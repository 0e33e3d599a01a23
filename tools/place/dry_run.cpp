#include "tools/place/dry_run.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <linux/stat.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <ctime>
#include <set>
#include <utility>

#include "tools/place/attribute_room.h"

namespace mavoea::tool {
namespace {

constexpr std::size_t kAttributeSizeMax = 65536;
constexpr std::size_t kAttributeNameMax = 255;

bool dry_run = false;

struct InHand {
    dev_t device = 0;
    ino_t inode = 0;
    std::map<std::string, std::optional<Bytes>> attributes;
    std::optional<AttributeRoom> room;  // none where that is not known
};
InHand in_hand;

bool IsInHand(const Inode& inode) {
    return inode.info().st_ino == in_hand.inode && inode.info().st_dev == in_hand.device;
}

std::optional<AttributeRoom> RoomOf(const Inode& inode) {
    const std::string path = inode.ProcPath();
    struct statfs info = {};
    if (::statfs(path.c_str(), &info) != 0 || info.f_type != EXT4_SUPER_MAGIC) return std::nullopt;
    AttributeRoom room(static_cast<std::size_t>(info.f_bsize));
    for (const std::string& name : inode.AttributeNames()) {
        const ssize_t size = ::getxattr(path.c_str(), name.c_str(), nullptr, 0);
        // What is there has room, whatever is thought here.
        if (size >= 0 && !room.Put(name, static_cast<std::size_t>(size))) return std::nullopt;
    }
    return room;
}

void TakeInHand(const Inode& inode) {
    if (IsInHand(inode)) return;
    in_hand = {inode.info().st_dev, inode.info().st_ino, {}, RoomOf(inode)};
}

using FileId = std::pair<dev_t, ino_t>;

FileId IdOf(const struct stat& info) { return {info.st_dev, info.st_ino}; }

struct ForeseenState {
    std::map<FileId, Foreseen::Entries> directories;
    std::set<FileId> gone;      // directories
    std::set<FileId> finished;  // the same
    ino_t last_number = 0;
};
ForeseenState& State() {
    static ForeseenState state;
    return state;
}

// 0, or the errno.
int MayWrite(int directory, const char* path, int mode) {
    return ::faccessat(directory, path, mode, AT_EACCESS) == 0 ? 0 : errno;
}

}  // namespace

void BeginDryRun() { dry_run = true; }
bool DryRun() { return dry_run; }

int WhyNoAttribute(const Inode& inode, const std::string& name, std::size_t size) {
    const std::string path = inode.ProcPath();
    if (!inode.HoldsContents() && name.starts_with("user.")) return EPERM;
    if (name.size() > kAttributeNameMax) return ERANGE;
    if (size > kAttributeSizeMax) return E2BIG;
    if (const int error = MayWrite(AT_FDCWD, path.c_str(), W_OK)) return error;
    return ::getxattr(path.c_str(), name.c_str(), nullptr, 0) < 0 && errno == ENOTSUP ? ENOTSUP : 0;
}

int WhyNoMode(const Inode& inode) {
    const uid_t user = ::geteuid();
    if (user != 0 && user != inode.info().st_uid) return EPERM;
    // The mode itself is no obstacle to a change of it.
    const int error = MayWrite(AT_FDCWD, inode.ProcPath().c_str(), W_OK);
    return error == EACCES ? 0 : error;
}

int WhyNoNewFile(const Directory& directory) {
    // Whoever makes a directory may write to it.
    if (directory.foreseen()) return 0;
    struct statx info;
    const int result = ::statx(directory.fd(), "", AT_EMPTY_PATH, STATX_BASIC_STATS, &info);
    if (result == 0 && (info.stx_attributes & STATX_ATTR_IMMUTABLE) != 0) return EPERM;
    return MayWrite(directory.fd(), ".", W_OK | X_OK);
}

int WhyNoRemoval(const Place& place) {
    if (const int error = WhyNoNewFile(*place.directory)) return error;
    if (const auto* const foreseen = Foreseen::Find(*place.directory, place.name)) {
        return foreseen->info ? 0 : ENOENT;
    }
    struct statx info;
    if (::statx(place.directory->fd(), place.name.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS,
                &info) != 0) {
        return errno;
    }
    if ((info.stx_attributes & (STATX_ATTR_IMMUTABLE | STATX_ATTR_APPEND)) != 0) return EPERM;
    const struct stat around = place.directory->Status();
    const uid_t user = ::geteuid();
    const bool owns = user == 0 || user == around.st_uid || user == info.stx_uid;
    return (around.st_mode & S_ISVTX) != 0 && !owns ? EPERM : 0;
}

int WhyNoWriting(const Place& place) {
    if (const auto* const foreseen = Foreseen::Find(*place.directory, place.name)) {
        return foreseen->info ? 0 : ENOENT;
    }
    struct statx info;
    const int directory = place.directory->fd();
    if (::statx(directory, place.name.c_str(), 0, STATX_BASIC_STATS, &info) != 0) return errno;
    if ((info.stx_attributes & (STATX_ATTR_IMMUTABLE | STATX_ATTR_APPEND)) != 0) return EPERM;
    return MayWrite(directory, place.name.c_str(), W_OK);
}

const Foreseen::Entry* Foreseen::Find(const Directory& directory, const std::string& name) {
    const Entries* const entries = In(directory);
    if (entries == nullptr) return nullptr;
    const auto found = entries->find(name);
    return found == entries->end() ? nullptr : &found->second;
}

const Foreseen::Entries* Foreseen::In(const Directory& directory) {
    if (State().directories.empty()) return nullptr;
    const auto found = State().directories.find(IdOf(directory.Status()));
    return found == State().directories.end() ? nullptr : &found->second;
}

void Foreseen::Come(const Place& place, const struct stat& info, const Place* from) {
    Entry entry = {.info = info};
    if (from != nullptr) {
        entry.contents_in = from->directory;
        entry.contents_name = from->name;
    }
    State().directories[IdOf(place.directory->Status())][place.name] = std::move(entry);
    place.directory->NoteCome(place.name);
    place.directory->Forget(place.name);
}

void Foreseen::Come(const Place& place, const std::shared_ptr<const File>& file) {
    Come(place, file->Status());
    State().directories[IdOf(place.directory->Status())][place.name].contents = file;
}

void Foreseen::ComeAppleDouble(const Place& place) {
    Come(place, StatusOfNew(*place.directory, S_IFREG | S_IRUSR | S_IWUSR));
    State().directories[IdOf(place.directory->Status())][place.name].is_apple_double = true;
}

void Foreseen::ComeDirectory(const Place& place, const struct stat& info, bool holds_entries) {
    Come(place, info);
    State().directories[IdOf(place.directory->Status())][place.name].holds_entries = holds_entries;
}

std::shared_ptr<const File> Foreseen::Entry::Open(int flags) const {
    if (contents) {
        const std::string path = "/proc/self/fd/" + std::to_string(contents->fd());
        auto file =
            std::make_shared<const File>(::open(path.c_str(), flags | O_CLOEXEC), contents->path());
        if (file->fd() < 0) throw SystemFailure(contents->path(), errno);
        return file;
    }
    return contents_in ? contents_in->FindFile(contents_name, O_RDONLY) : nullptr;
}

void Foreseen::Go(const Directory& directory, const std::string& name) {
    State().directories[IdOf(directory.Status())][name] = {};
    directory.Forget(name);
}

void Foreseen::GoWithAll(const Directory& directory, const std::string& name) {
    if (const auto info = directory.StatusOf(name)) {
        State().directories.erase(IdOf(*info));
        State().gone.insert(IdOf(*info));
    }
    Go(directory, name);
}

bool Foreseen::HasGone(const struct stat& directory) {
    return State().gone.contains(IdOf(directory));
}

void Foreseen::NoteFinished(const struct stat& directory) {
    State().finished.insert(IdOf(directory));
}

bool Foreseen::IsFinished(const struct stat& directory) {
    return State().finished.contains(IdOf(directory));
}

void Foreseen::ForgetAll() { State() = {}; }

struct stat Foreseen::StatusOfNew(const Directory& directory, mode_t mode) {
    const struct stat around = directory.Status();
    struct stat info = {};
    info.st_dev = around.st_dev;
    info.st_ino = --State().last_number;  // from the highest one downwards
    info.st_mode = mode;
    info.st_nlink = S_ISDIR(mode) ? 2 : 1;
    info.st_uid = ::geteuid();
    info.st_gid = (around.st_mode & S_ISGID) != 0 ? around.st_gid : ::getegid();
    timespec now = {};
    (void)::clock_gettime(CLOCK_REALTIME, &now);
    info.st_atim = info.st_mtim = info.st_ctim = now;
    return info;
}

const std::optional<Bytes>* Rehearsed::Find(const Inode& inode, const std::string& name) {
    if (!IsInHand(inode)) return nullptr;
    const auto found = in_hand.attributes.find(name);
    return found == in_hand.attributes.end() ? nullptr : &found->second;
}

void Rehearsed::Forget() { in_hand = {}; }

bool Rehearsed::HasRoom(const Inode& inode, const std::string& name, std::size_t size) {
    TakeInHand(inode);
    if (!in_hand.room) return true;
    AttributeRoom room = *in_hand.room;
    return room.Put(name, size);
}

void Rehearsed::Note(const Inode& inode, const std::string& name, std::optional<Bytes> value) {
    TakeInHand(inode);
    if (in_hand.room && value) (void)in_hand.room->Put(name, value->size());
    if (in_hand.room && !value) in_hand.room->Remove(name);
    in_hand.attributes.insert_or_assign(name, std::move(value));
}

}  // namespace mavoea::tool

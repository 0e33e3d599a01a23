#include "tools/place/dry_run.h"

#include <fcntl.h>
#include <linux/stat.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <utility>

namespace mavoea::tool {
namespace {

constexpr std::size_t kAttributeSizeMax = 65536;
constexpr std::size_t kAttributeNameMax = 255;

bool dry_run = false;

struct InHand {
    dev_t device = 0;
    ino_t inode = 0;
    std::map<std::string, std::optional<Bytes>> attributes;
};
InHand in_hand;

bool IsInHand(const Inode& inode) {
    return inode.info().st_ino == in_hand.inode && inode.info().st_dev == in_hand.device;
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

int WhyNoNewFile(const Directory& directory) { return MayWrite(directory.fd(), ".", W_OK | X_OK); }

int WhyNoRemoval(const Place& place) {
    if (const int error = WhyNoNewFile(*place.directory)) return error;
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

const std::optional<Bytes>* Rehearsed::Find(const Inode& inode, const std::string& name) {
    if (!dry_run || !IsInHand(inode)) return nullptr;
    const auto found = in_hand.attributes.find(name);
    return found == in_hand.attributes.end() ? nullptr : &found->second;
}

void Rehearsed::Forget() { in_hand = {}; }

void Rehearsed::Note(const Inode& inode, const std::string& name, std::optional<Bytes> value) {
    if (!IsInHand(inode)) in_hand = {inode.info().st_dev, inode.info().st_ino, {}};
    in_hand.attributes.insert_or_assign(name, std::move(value));
}

}  // namespace mavoea::tool

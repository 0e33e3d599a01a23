#include "tools/store/rights.h"

#include <acl/libacl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>

#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr mode_t kReadWrite = 0666;
constexpr mode_t kExecute = 0111;
constexpr mode_t kGroupBits = 0070;
constexpr const char* kAcl = "system.posix_acl_access";

void DropExecution(acl_t acl) {
    acl_entry_t entry;
    for (int more = acl_get_entry(acl, ACL_FIRST_ENTRY, &entry); more == 1;
         more = acl_get_entry(acl, ACL_NEXT_ENTRY, &entry)) {
        acl_permset_t permissions;
        if (acl_get_permset(entry, &permissions) != 0) continue;
        (void)acl_delete_perm(permissions, ACL_EXECUTE);
        (void)acl_set_permset(entry, permissions);
    }
}

std::string Octal(mode_t mode) {
    std::string text = "0";
    for (unsigned shift = 9; shift > 0; shift -= 3) {
        text += static_cast<char>('0' + (mode >> (shift - 3) & 7));
    }
    return text;
}

}  // namespace

Rights Rights::Of(const Inode& object) {
    const struct stat info = object.Status();
    Rights rights;
    rights.owner_ = info.st_uid;
    rights.group_ = info.st_gid;
    rights.mode_ = info.st_mode & kReadWrite;
    rights.may_have_ = info.st_mode & kExecute;
    // One that says no more than the mode is not kept.
    if (object.HoldsContents() && object.Attribute(kAcl)) {
        rights.acl_.reset(acl_get_file(object.ProcPath().c_str(), ACL_TYPE_ACCESS));
        if (rights.acl_) DropExecution(rights.acl_.get());
    }
    return rights;
}

Rights Rights::Of(const Inode& object, mode_t mode) {
    Rights rights = Of(object);
    rights.mode_ = mode & kReadWrite;
    // The group's bits are the most that an ACL grants to anybody but owner and others.
    rights.cut_ = rights.acl_ != nullptr;
    return rights;
}

void Rights::Give(const File& file) const {
    const struct stat now = file.Status();
    mode_t mode = mode_;
    const bool owned = now.st_uid == owner_ && now.st_gid == group_;
    if (!owned && ::fchown(file.fd(), owner_, group_) != 0 &&
        ::fchown(file.fd(), static_cast<uid_t>(-1), group_) != 0 && now.st_gid != group_) {
        // Its group is another one, whose members are none of the object's.
        mode &= ~kGroupBits;
    } else if (acl_ && acl_set_fd(file.fd(), acl_.get()) == 0 && !cut_) {
        return;
    }
    if (::fchmod(file.fd(), mode) != 0) throw SystemFailure(file.path(), errno);
}

void Rights::GiveAgain(const File& file) const {
    constexpr mode_t kOwnerBits = 0700;
    const bool goes = !acl_ && ::fgetxattr(file.fd(), kAcl, nullptr, 0) > 0;
    // Without it the group would have what the list granted at most to anybody.
    if (goes && (::fchmod(file.fd(), file.Status().st_mode & kOwnerBits) != 0 ||
                 ::fremovexattr(file.fd(), kAcl) != 0)) {
        throw SystemFailure(file.path(), errno);
    }
    Give(file);
}

std::optional<std::string> Rights::Missing(const File& file) const {
    constexpr mode_t kAllBits = 0777;
    const struct stat now = file.Status();
    const auto other = [](const char* what, std::uint64_t is, std::uint64_t wanted) {
        return std::string(what) + std::to_string(is) + ", not " + std::to_string(wanted);
    };
    if (now.st_uid != owner_) return other("its owner is ", now.st_uid, owner_);
    if (now.st_gid != group_) return other("its group is ", now.st_gid, group_);
    const bool by_acl = acl_ && !cut_;
    if (!by_acl && (now.st_mode & kAllBits & ~may_have_) != mode_) {
        return "its mode is " + Octal(now.st_mode & kAllBits) + ", not " + Octal(mode_);
    }
    // Of a file without one it is what the mode says.
    const Acl found(acl_get_fd(file.fd()));
    if (!found) {
        if (errno == ENOTSUP || errno == ENOSYS) return std::nullopt;
        throw SystemFailure(file.path(), errno);
    }
    if (by_acl) {
        if (acl_cmp(found.get(), acl_.get()) == 0) return std::nullopt;
        return "its ACL is another one than the object's";
    }
    if (cut_ || acl_equiv_mode(found.get(), nullptr) == 0) return std::nullopt;
    return "it has an ACL, and its object has none";
}

}  // namespace mavoea::tool

#include "tools/transfer/permissions.h"

#include <acl/libacl.h>
#include <attr/error_context.h>
#include <attr/libattr.h>
#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <vector>

#include "tools/place/dry_run.h"
#include "tools/say/job.h"
#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr mode_t kPermissions = 07777;
constexpr const char* kAccessAcl = "system.posix_acl_access";

// Whether what failed with it is about what may be kept.
bool IsRefusal(int error) {
    switch (error) {
        case EPERM:
        case EACCES:
        case ENOTSUP:
        case ENOSYS:
        case EINVAL:
        case ENODATA:
            return true;
        default:
            return false;
    }
}

// What the libraries report, in place of a line on standard error.
struct Complaints : error_context {
    int grave = 0;  // errno of the first failure that is no refusal
    int refused = 0;

    Complaints() : error_context{Hear, Quote, Unquote} {}

    static void Hear(error_context* context, const char* /*format*/, ...) {
        const int error = errno;
        auto* const self = static_cast<Complaints*>(context);
        int& first = IsRefusal(error) ? self->refused : self->grave;
        if (first == 0) first = error;
    }
    static const char* Quote(error_context* /*context*/, const char* text) { return text; }
    static void Unquote(error_context* /*context*/, const char* /*text*/) {}
};

// Whether the file belongs to whom it should afterwards. Users other than root may give a group at
// most.
bool CopyOwner(const struct stat& info, const Inode& to) {
    if (to.TrySetOwner(info.st_uid, info.st_gid)) return true;
    if (!to.TrySetOwner(static_cast<uid_t>(-1), info.st_gid)) {
        const struct stat now = to.Status();
        return now.st_uid == info.st_uid && now.st_gid == info.st_gid;
    }
    return ::geteuid() == info.st_uid;
}

// Where the list of attributes changes while libattr reads it, its functions read what nobody
// wrote.
void CopyAttributes(const Inode& from, const Inode& to, const Manner& manner,
                    const std::function<bool(const std::string&)>& wanted) {
    const bool insists = manner.insists && manner.keeps_attributes;
    const auto unless_refused = [&](const auto& action) {
        try {
            action();
        } catch (const SystemFailure& failure) {
            if (insists) {
                throw Refusal("setting attributes for " + Quoted(to.path()), failure.error());
            }
            if (!IsRefusal(failure.error())) throw;
        }
    };
    std::vector<std::string> names;
    unless_refused([&] { names = from.AttributeNames(); });
    for (const std::string& name : names) {
        Complaints unread;  // a broken /etc/xattr.conf
        // Those of permissions go with the ACL.
        if (attr_copy_action(name.c_str(), &unread) != 0 || !wanted(name)) continue;
        if (!manner.keeps_attributes && !name.starts_with("user.")) continue;
        unless_refused([&] {
            if (const auto value = from.Attribute(name)) to.SetAttribute(name, *value);
        });
    }
}

// An ACL with more than the mode says has no place on some file systems.
void ForeseeMode(const Inode& from, const Inode& to, Complaints* complaints) {
    if (const int error = WhyNoMode(to)) throw SystemFailure(to.path(), error);
    if (::acl_extended_file(from.ProcPath().c_str()) != 1) return;
    const bool takes =
        ::getxattr(to.ProcPath().c_str(), kAccessAcl, nullptr, 0) >= 0 || errno != ENOTSUP;
    if (!takes) complaints->refused = ENOTSUP;
}

int CopyMode(const Subject& from, const Subject& to, error_context* context) {
    // Those of directories have default ACLs as well, which take a path.
    if (from.fd >= 0 && to.fd >= 0 && !S_ISDIR(from.inode->info().st_mode)) {
        return perm_copy_fd(from.inode->path().c_str(), from.fd, to.inode->path().c_str(), to.fd,
                            context);
    }
    return perm_copy_file(from.inode->ProcPath().c_str(), to.inode->ProcPath().c_str(), context);
}

}  // namespace

std::optional<std::string> CopyPermissions(const Subject& from, const Subject& to,
                                           const Manner& manner,
                                           const std::function<bool(const std::string&)>& wanted) {
    const struct stat& info = from.inode->info();
    const bool owned = !manner.keeps_owner || CopyOwner(info, *to.inode);
    CopyAttributes(*from.inode, *to.inode, manner, wanted);
    if (S_ISLNK(info.st_mode) || !manner.keeps_mode) return std::nullopt;

    Complaints permissions;
    if (DryRun()) {
        ForeseeMode(*from.inode, *to.inode, &permissions);
    } else if (CopyMode(from, to, &permissions) != 0) {
        if (permissions.grave != 0) throw SystemFailure(to.inode->path(), permissions.grave);
        to.inode->SetMode(info.st_mode & kPermissions);
    }
    // Nobody gets another user's rights by a copy of his program.
    if (!owned && (info.st_mode & (S_ISUID | S_ISGID)) != 0) {
        to.inode->SetMode(info.st_mode & 01777);
    }
    if (permissions.refused == 0) return std::nullopt;
    return std::string("its permissions could not be kept: ") + std::strerror(permissions.refused);
}

}  // namespace mavoea::tool

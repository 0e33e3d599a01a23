#include "tools/permissions.h"

#include <acl/libacl.h>
#include <attr/error_context.h>
#include <attr/libattr.h>
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "tools/messages.h"

namespace mavoea::tool {
namespace {

constexpr mode_t kPermissions = 07777;

// What the libraries report, in place of a line on standard error.
struct Complaints : error_context {
    const std::function<bool(const std::string&)>* wanted = nullptr;
    int grave = 0;  // errno of the first failure that is not about what may be kept
    int refused = 0;

    Complaints() : error_context{Hear, Quote, Unquote} {}

    static void Hear(error_context* context, const char* /*format*/, ...) {
        const int error = errno;
        auto* const self = static_cast<Complaints*>(context);
        switch (error) {
            case EPERM:
            case EACCES:
            case ENOTSUP:
            case ENOSYS:
            case EINVAL:
            case ENODATA:  // gone since the names were listed
                if (self->refused == 0) self->refused = error;
                break;
            default:
                if (self->grave == 0) self->grave = error;
                break;
        }
    }
    static const char* Quote(error_context* /*context*/, const char* text) { return text; }
    static void Unquote(error_context* /*context*/, const char* /*text*/) {}
};

int IsWanted(const char* name, error_context* context) {
    // Those of permissions go with the ACL.
    if (attr_copy_action(name, context) != 0) return 0;
    return (*static_cast<Complaints*>(context)->wanted)(name) ? 1 : 0;
}

// Whether the file belongs to whom it should afterwards. Users other than root may give a group at
// most.
bool CopyOwner(const struct stat& info, const std::string& to) {
    if (::lchown(to.c_str(), info.st_uid, info.st_gid) == 0) return true;
    if (::lchown(to.c_str(), static_cast<uid_t>(-1), info.st_gid) != 0) {
        struct stat now;
        return ::lstat(to.c_str(), &now) == 0 && now.st_uid == info.st_uid &&
               now.st_gid == info.st_gid;
    }
    return ::geteuid() == info.st_uid;
}

}  // namespace

std::optional<std::string> CopyPermissions(const std::string& from, const struct stat& info,
                                           const std::string& to,
                                           const std::function<bool(const std::string&)>& wanted) {
    const bool owned = CopyOwner(info, to);
    Complaints attributes;
    attributes.wanted = &wanted;
    if (attr_copy_file(from.c_str(), to.c_str(), IsWanted, &attributes) != 0 &&
        attributes.grave != 0) {
        throw SystemFailure(to, attributes.grave);
    }
    if (S_ISLNK(info.st_mode)) return std::nullopt;

    Complaints permissions;
    if (perm_copy_file(from.c_str(), to.c_str(), &permissions) != 0) {
        if (permissions.grave != 0) throw SystemFailure(to, permissions.grave);
        (void)::chmod(to.c_str(), info.st_mode & kPermissions);
    }
    // Nobody gets another user's rights by a copy of his program.
    if (!owned && (info.st_mode & (S_ISUID | S_ISGID)) != 0) {
        (void)::chmod(to.c_str(), info.st_mode & 01777);
    }
    if (permissions.refused == 0) return std::nullopt;
    return std::string("its permissions could not be kept: ") + std::strerror(permissions.refused);
}

void CopyTimes(const struct stat& info, const std::string& to) {
    const timespec times[] = {info.st_atim, info.st_mtim};
    if (::utimensat(AT_FDCWD, to.c_str(), times, AT_SYMLINK_NOFOLLOW) != 0 && errno != EPERM) {
        throw SystemFailure(to, errno);
    }
}

}  // namespace mavoea::tool

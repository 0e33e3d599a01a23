// The ACL of EA directories. A default ACL takes the place of the umask for what is made inside, so
// that a user of the share can change the metadata that another one has made.

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <sys/acl.h>
#include <unistd.h>

#include "platform/include/mavoacl.h"

namespace {

constexpr char kDefaultAcl[] = "user::rwx,group::rwx,other::rwx";

// Sets the default ACL of the directory on fd. False with errno.
bool SetDefaultAcl(int fd) {
    acl_t acl = acl_from_text(kDefaultAcl);
    if (acl == nullptr) return false;
    // libacl sets default ACLs by path only. This one leads to what the descriptor holds, whatever
    // has been put in its place since.
    char path[sizeof "/proc/self/fd/-2147483648"];
    snprintf(path, sizeof path, "/proc/self/fd/%d", fd);
    const bool done = acl_set_file(path, ACL_TYPE_DEFAULT, acl) == 0;
    const int saved = errno;
    acl_free(acl);
    errno = saved;
    return done;
}

bool MeansNoAcls(int error) { return error == ENOTSUP || error == EOPNOTSUPP || error == ENOSYS; }

}  // namespace

int MAVOACLSetEADirACL(const char* szPath) {
    if (szPath == nullptr) {
        errno = EINVAL;
        return -1;
    }
    const int saved = errno;
    const int fd = open(szPath, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (fd < 0) return -1;
    const bool done = SetDefaultAcl(fd);
    const int error = errno;
    close(fd);
    if (!done && !MeansNoAcls(error)) {
        errno = error;
        return -1;
    }
    errno = saved;
    return 0;
}

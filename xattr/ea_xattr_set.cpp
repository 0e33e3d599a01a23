// Sets an extended attribute, or the resource fork in the guise of one.

#include <errno.h>
#include <sys/xattr.h>

#include "include/mavoea.h"
#include "xattr/resource_fork.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_xattr_set");

int WriteFork(const char* szPath, const void* szValue, std::size_t size, int flags) {
    struct stat info;
    if (kernel::Stat(szPath, &info) != 0) {
        unit.Log("%s:%d Fail to stat(%s). %m", szPath);
        return -1;
    }
    if (S_ISDIR(info.st_mode)) return unit.Fail(Err::kNothingThere);

    const ForkAccess fork(unit, szPath, info.st_mode);
    if (fork.Stat(&info) != 0) {
        unit.Log("%s:%d Fail to stat(%s). %m", fork.path());
        return -1;
    }
    const bool absent = info.st_size == 0;
    if (absent && (flags & XATTR_REPLACE) != 0) {
        errno = ENODATA;
        return -1;
    }
    if (!absent && (flags & XATTR_CREATE) != 0) {
        errno = EEXIST;
        return -1;
    }

    UniqueFile file(kernel::Fopen(fork.path(), "w+b"));
    if (!file) {
        unit.Log("%s:%d Fail to open(%s). %m", fork.path());
        return -1;
    }
    // Only the close hands the last bytes to the kernel, so it decides, and sync() comes after it.
    if (kernel::Fwrite(szValue, size, file.get()) != size || !file.Close()) {
        unit.Log("%s:%d Fail to write(%s). %m", fork.path());
        return -1;
    }
    kernel::Sync();
    return 0;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAXattrSet(const char* szPath, const char* szName, const void* szValue, int cbValue,
                   int flags) {
    if (szPath == nullptr) return unit.FailCheck("((void *)0) != szPath");
    if (szName == nullptr) return unit.FailCheck("((void *)0) != szName");
    if (szValue == nullptr) return unit.FailCheck("((void *)0) != szValue");
    if (cbValue < 0) return unit.FailCheck("0 <= cbValue");
    const auto size = static_cast<std::size_t>(cbValue);
    if (szName == kResourceForkName) return WriteFork(szPath, szValue, size, flags);
    return kernel::Setxattr(szPath, szName, szValue, size, flags);
}

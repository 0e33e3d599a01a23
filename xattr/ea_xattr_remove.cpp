// Removes an extended attribute, or empties the resource fork in the guise of one.

#include <errno.h>

#include "include/mavoea.h"
#include "xattr/resource_fork.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_xattr_remove");

int ClearFork(const char* szPath) {
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
    if (info.st_size == 0) return 0;

    const UniqueFile file(kernel::Fopen(fork.path(), "w+b"));  // opening it so empties it
    if (!file) {
        unit.Log("%s:%d Fail to open(%s). %m", fork.path());
        return -1;
    }
    kernel::Sync();
    return 0;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAXattrRemove(const char* szPath, const char* szName) {
    if (szPath == nullptr) return unit.FailCheck("((void *)0) != szPath");
    if (szName == nullptr) return unit.FailCheck("NULL != szName");
    if (szName == kResourceForkName) return ClearFork(szPath);
    return kernel::Removexattr(szPath, szName);
}

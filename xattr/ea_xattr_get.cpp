// Reads an extended attribute, or the resource fork in the guise of one.

#include <errno.h>
#include <string.h>

#include <utility>

#include "include/mavoea.h"
#include "xattr/resource_fork.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_xattr_get");
constexpr ForkLines fork_lines = {
    .in = __builtin_LINE(),
    .back = __builtin_LINE(),
};

int ReadFork(const char* szPath, void* szValue, int cbValue) {
    struct stat info;
    if (kernel::Stat(szPath, &info) != 0) {
        return unit.Fail(errno == ENOENT ? Err::kNothingThere : Err::kStat);
    }
    if (S_ISDIR(info.st_mode)) return unit.Fail(Err::kNothingThere);

    const ForkAccess fork(unit, fork_lines, szPath, info.st_mode);
    if (fork.Stat(&info) != 0) {
        if (errno != ENOENT) unit.Log("%s:%d Fail to stat(%s). %m", fork.path());
        return -1;
    }
    if (info.st_size == 0) {
        errno = ENODATA;
        return unit.Fail(Err::kNothingThere);
    }
    // A fork whose size no result can tell fits no buffer either.
    const bool countable = std::in_range<int>(info.st_size);
    if (cbValue == 0 && countable) return static_cast<int>(info.st_size);
    if (info.st_size > cbValue) {
        errno = ERANGE;
        return unit.Fail(Err::kRange);
    }

    const UniqueFile file(kernel::Fopen(fork.path(), "rb"));
    if (!file) {
        unit.Log("%s:%d Fail to open(%s). %m", fork.path());
        return -1;
    }
    const auto size = static_cast<std::size_t>(info.st_size);
    errno = EIO;  // what a fork that has become shorter meanwhile amounts to
    if (kernel::Fread(szValue, size, file.get()) != size) {
        unit.Log("%s:%d Fail to read(%s). %m", fork.path());
        return -1;
    }
    return static_cast<int>(size);
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAXattrGet(const char* szPath, const char* szName, void* szValue, int cbValue) {
    if (szPath == nullptr) return unit.FailCheck("((void *)0) != szPath");
    if (szName == nullptr) return unit.FailCheck("((void *)0) != szName");
    if (!((0 < cbValue && szValue != nullptr) || cbValue == 0)) {
        return unit.FailCheck("((0 < cbValue && NULL != szValue) || 0 == cbValue)");
    }
    if (szName == kResourceForkName) return ReadFork(szPath, szValue, cbValue);
    const ssize_t size =
        kernel::Getxattr(szPath, szName, szValue, static_cast<std::size_t>(cbValue));
    return size < 0 ? -1 : static_cast<int>(size);
}

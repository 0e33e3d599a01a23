// Sets an extended attribute, or the resource fork in the guise of one.

#include <errno.h>
#include <sys/xattr.h>

#include "include/mavoea.h"
#include "util/bytes.h"
#include "xattr/resource_fork.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_xattr_set");
constexpr ForkLines fork_lines = {
    .in = __builtin_LINE(),
    .back = __builtin_LINE(),
};

int WriteFork(const ForkAccess& fork, bool absent, ByteView value, int flags) {
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
    const std::size_t written = kernel::Fwrite(value.data(), value.size(), file.get());
    if (written != value.size() || !file.Close()) {
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
    if (szName == kResourceForkName) {
        const ByteView value(static_cast<const std::uint8_t*>(szValue), size);
        return ChangeFork(unit, fork_lines, szPath, [&](const ForkAccess& fork, off_t fork_size) {
            return WriteFork(fork, fork_size == 0, value, flags);
        });
    }
    return kernel::Setxattr(szPath, szName, szValue, size, flags);
}

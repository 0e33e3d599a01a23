// Removes an extended attribute, or empties the resource fork in the guise of one.

#include "include/mavoea.h"
#include "xattr/resource_fork.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_xattr_remove");
constexpr ForkLines fork_lines = {
    .in = __builtin_LINE(),
    .back = __builtin_LINE(),
};

int ClearFork(const ForkAccess& fork) {
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
    if (szName == kResourceForkName) {
        return ChangeFork(unit, fork_lines, szPath, [](const ForkAccess& fork, off_t fork_size) {
            return fork_size == 0 ? 0 : ClearFork(fork);
        });
    }
    return kernel::Removexattr(szPath, szName);
}

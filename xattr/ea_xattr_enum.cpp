// Lists an object's extended attributes.

#include <errno.h>
#include <string.h>

#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_xattr_enum");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAXattrEnum(const char* szPath, MLIBCSzList** ppList) {
    if (szPath == nullptr) return unit.FailCheck("((void *)0) != szPath");
    if (ppList == nullptr) return unit.FailCheck("((void *)0) != ppList");
    if (*ppList == nullptr) return unit.FailCheck("NULL != *ppList");

    const ssize_t room = kernel::Listxattr(szPath, nullptr, 0);
    if (room < 1) {
        // No file and no support for attributes count as no attributes.
        if (room < 0 && errno != ENOENT && errno != ENODATA) return unit.Fail(Err::kSystemCall);
        MLIBCSzListRemoveAll(*ppList);
        return 0;
    }

    const auto capacity = static_cast<std::size_t>(room);
    const auto names = Owned<char>::AllocateZeroed(capacity);
    if (!names) return unit.Fail(Err::kBufferMemory);
    const ssize_t size = kernel::Listxattr(szPath, names.get(), capacity);
    if (size < 0) return unit.Fail(Err::kSystemCall);

    names.get()[capacity - 1] = '\0';  // Where the last name ends, whatever a filesystem gave.
    const char* const end = names.get() + size;
    for (const char* name = names.get(); name < end; name += strlen(name) + 1) {
        if (MLIBCSzListPush(ppList, name) < 0) return -1;
    }
    return 0;
}

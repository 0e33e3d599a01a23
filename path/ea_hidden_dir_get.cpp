// The list of the system's hidden directories.

#include "include/mavoea.h"
#include "path/names.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_is_hidden_dir");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAHiddenDirGet(MLIBCSzList** ppList) {
    if (ppList == nullptr || *ppList == nullptr) return unit.Fail(Err::kBadArgument);
    for (const char* name : kHiddenDirNames) {
        if (MLIBCSzListPush(ppList, name) < 0) return -1;
    }
    return 0;
}

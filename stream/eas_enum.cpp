// Lists a stream's attributes.

#include "include/mavoea.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_enum");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASEnum(EASHandle* h, MLIBCSzList** ppList) {
    if (h == nullptr || ppList == nullptr) return unit.Fail(Err::kBadArgument);
    if (*ppList == nullptr) return unit.Fail(Err::kBadArgument);
    const std::span<EASEntry> attributes = Attributes(*h);
    for (const EASEntry& entry : attributes) {
        if (MLIBCSzListPush(ppList, entry.name) < 0) {
            // All of it goes, names from before this call included.
            MLIBCSzListRemoveAll(*ppList);
            return -1;
        }
    }
    return static_cast<int>(attributes.size());
}

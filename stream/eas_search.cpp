// Finds an attribute by name.

#include "include/mavoea.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_search");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASSearch(EASHandle* h, const char* name) {
    if (h == nullptr || name == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    const int index = FindAttribute(*h, name);
    return index < 0 ? unit.Fail(Err::kNoAttribute) : index;
}

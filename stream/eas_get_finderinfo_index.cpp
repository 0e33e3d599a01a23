// Which of a header's two entry descriptors is which.

#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_get_finderinfo_index");

}  // namespace

int EASGetFinderInfoIndex(EASHandle* h) {
    if (h == nullptr) return unit.Fail(Err::kBadArgument);
    const StreamHeader header = LoadHeader(*h);
    if (header.file.entry_count > kStreamDescriptorMax) return unit.Fail(Err::kBadArgument);
    if (header.finder_info.id == EntryId::kFinderInfo) return 0;
    if (header.resource_fork.id == EntryId::kFinderInfo) return 1;
    return unit.Fail(Err::kRead);
}

int EASGetRForkRange(EASHandle* h, unsigned* start, unsigned* length) {
    if (h == nullptr || start == nullptr || length == nullptr) return -1;
    const int finder_info = EASGetFinderInfoIndex(h);
    if (finder_info < 0) return -1;
    const StreamHeader header = LoadHeader(*h);
    const Range slots[] = {header.finder_info.data, header.resource_fork.data};
    const std::uint64_t end = slots[finder_info].end();
    if (end >= kStreamSizeMax) return unit.Fail(Err::kRead);
    *start = static_cast<unsigned>(end);
    *length = slots[1 - finder_info].length;
    return 0;
}

}  // namespace mavoea

// Which of a header's two entry descriptors is which.

#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_get_finderinfo_index");

int FinderInfoSlot(const StreamHeader& header) {
    if (header.file.entry_count > kStreamDescriptorMax) return unit.Fail(Err::kBadArgument);
    if (header.finder_info.id == EntryId::kFinderInfo) return 0;
    if (header.resource_fork.id == EntryId::kFinderInfo) return 1;
    return unit.Fail(Err::kRead);
}

}  // namespace

int EASGetFinderInfoIndex(EASHandle* h) {
    return h == nullptr ? unit.Fail(Err::kBadArgument) : FinderInfoSlot(LoadHeader(*h));
}

int EASGetRForkRange(EASHandle* h, unsigned* start, unsigned* length) {
    if (h == nullptr || start == nullptr || length == nullptr) return -1;
    const StreamHeader header = LoadHeader(*h);
    const int finder_info = FinderInfoSlot(header);
    if (finder_info < 0) return -1;
    const Range slots[] = {header.finder_info.data, header.resource_fork.data};
    const std::uint64_t end = slots[finder_info].end();
    if (end >= kStreamSizeMax) return unit.Fail(Err::kRead);
    *start = static_cast<unsigned>(end);
    *length = slots[1 - finder_info].length;
    return 0;
}

}  // namespace mavoea

// Removes an attribute, durably, and gives back the space that it took.

#include <algorithm>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_remove");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASRemove(EASHandle* h, const char* name) {
    if (h == nullptr || name == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    if (h->lockType != F_WRLCK) return unit.Fail(Err::kNotPermitted);
    const int index = MAVOEASSearch(h, name);
    if (index < 0) return -1;

    Survey survey;
    Range fork;
    if (SurveyStream(h, unit, &survey, &fork) != 0) return -1;

    const EASEntry& dropped = h->entries[index];
    const Range old_data = survey.header.attributes.data;
    Range data = old_data;  // as it will be
    data.offset -= RemovedRecordSize(dropped.nameLength);
    data.length -= dropped.length;
    StreamImage image(data.end());
    if (!image.ok()) return unit.Fail(Err::kMemory);
    const auto removed = static_cast<unsigned>(index);
    if (GatherValues(*h, old_data, removed, image.At(data.offset), true) != 0) return -1;
    MoveEntry(h, &survey.header, removed, true);
    image.PutHead(survey.header, h);

    if (EASShiftRFork(h, static_cast<unsigned>(data.end()), fork.offset, fork.length) != 0) {
        return -1;
    }
    if (image.Write(h->fd, unit) != 0) return -1;
    // The file must keep as many descriptors as its header declares, or it could not be opened any
    // more. That it stays longer when this fails harms nobody.
    const std::uint64_t declared = DescriptorsEnd(survey.header.file.entry_count);
    (void)kernel::Ftruncate(h->fd,
                            static_cast<off_t>(std::max(data.end() + fork.length, declared)));
    return MAVOEASFlush(h);
}

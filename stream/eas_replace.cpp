// Gives an attribute another value, of whatever length, in one rewrite: nothing is left of a longer
// one, and no crash finds the attribute removed and not written yet.

#include <string.h>

#include <algorithm>
#include <climits>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_write");

}  // namespace

int EASReplace(EASHandle* h, const char* name, ByteView value) {
    // As MAVOEASWrite() refuses them.
    if (strlen(name) >= kNameSizeMax || value.size() > INT_MAX) {
        return unit.Fail(Err::kBadArgument);
    }
    const int index = FindAttribute(*h, name);
    const auto size = static_cast<std::uint32_t>(value.size());
    if (index < 0) return MAVOEASWrite(h, name, value.data(), size, 0, 0) < 0 ? -1 : 0;

    Survey survey;
    Range fork;
    if (SurveyStream(h, unit, &survey, &fork) != 0) return -1;
    Range& data = survey.header.attributes.data;
    const std::uint64_t value_offset = data.end() - h->entries[index].length;
    const std::uint64_t total_size = value_offset + size;
    if (!FitsStream(total_size, fork.length)) return unit.Fail(Err::kBadArgument);

    // The image has room for the value as it is, too: it is gathered whole.
    StreamImage image(std::max(total_size, data.end()));
    if (!image.ok()) return unit.Fail(Err::kMemory);
    const auto replaced = static_cast<unsigned>(index);
    if (GatherValues(*h, data, replaced, image.At(data.offset), false) != 0) return -1;
    Room room;
    if (room.Reserve(h->fd, data.end() + fork.length, total_size + fork.length, unit) != 0) {
        return -1;
    }
    MoveEntry(h, &survey.header, replaced, false);
    std::copy(value.begin(), value.end(), image.At(value_offset));
    Attributes(*h).back().length = size;
    data.length = static_cast<std::uint32_t>(total_size - data.offset);
    image.Cut(total_size);
    image.PutHead(survey.header, h);

    // The fork makes way before the values come and closes up when they have: it lies over none.
    const auto fork_start = static_cast<unsigned>(total_size);
    const bool makes_way = fork_start > fork.offset;
    if (makes_way && EASShiftRFork(h, fork_start, fork.offset, fork.length) != 0) return -1;
    if (image.Write(h->fd, unit) != 0) return -1;
    room.Keep();
    if (!makes_way && EASShiftRFork(h, fork_start, fork.offset, fork.length) != 0) return -1;
    // As after a removal, the file keeps as many descriptors as its header declares, and that it
    // stays longer when this fails harms nobody.
    const std::uint64_t declared = DescriptorsEnd(survey.header.file.entry_count);
    (void)kernel::Ftruncate(h->fd,
                            static_cast<off_t>(std::max(total_size + fork.length, declared)));
    return MAVOEASFlush(h);
}

}  // namespace mavoea

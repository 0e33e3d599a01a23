// Sets the length of an attribute's value, durably. The resource fork's bytes stay where they are
// while its offset follows the values: callers truncate streams without a fork, or write the fork
// afterwards.

#include <string.h>

#include <algorithm>

#include "include/mavoea.h"
#include "stream/layout.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_truncate");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASTruncate(EASHandle* h, const char* name, unsigned length) {
    if (h == nullptr || name == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    if (h->lockType != F_WRLCK) return unit.Fail(Err::kNotPermitted);
    const int index = MAVOEASSearch(h, name);
    if (index < 0) return -1;

    Survey survey;
    if (SurveyTable(h, unit, &survey) != 0) return -1;
    Range& data = survey.header.attributes.data;
    const std::uint32_t old_length = h->entries[index].length;
    const std::uint64_t value_offset = data.end() - old_length;
    const std::uint64_t total_size = value_offset + length;
    const auto fork_length = static_cast<std::uint32_t>(
        std::min<std::uint64_t>(survey.header.resource_fork.data.length, survey.file_size));
    if (!IsValueLength(length) || !FitsStream(total_size, fork_length)) {
        return unit.Fail(Err::kBadArgument);
    }

    // The image has room for the value as it is, too: it is gathered whole.
    StreamImage image(std::max(total_size, data.end()));
    if (!image.ok()) return unit.Fail(Err::kMemory);
    const auto cut = static_cast<unsigned>(index);
    if (GatherValues(*h, data, cut, image.At(data.offset), false) != 0) return -1;
    Room room;
    if (room.Reserve(h->fd, data.end(), total_size, unit) != 0) return -1;
    MoveEntry(h, &survey.header, cut, false);
    if (length > old_length) memset(image.At(data.end()), 0, length - old_length);
    Attributes(*h).back().length = length;
    data.length = static_cast<std::uint32_t>(total_size - data.offset);
    image.Cut(total_size);
    image.PutHead(survey.header, h);

    if (image.Write(h->fd, unit) != 0) return -1;
    room.Keep();
    return MAVOEASFlush(h) != 0 ? unit.Fail(Err::kSystemCall) : 0;
}

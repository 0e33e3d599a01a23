// Makes an attribute the last one and gathers all values in memory, with its own at the end or
// without it.

#include <algorithm>

#include "include/mavoea.h"
#include "stream/layout.h"
#include "stream/names.h"
#include "util/file_io.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_update_entry");

// Reads the values before and behind `value` into `to`, then `value` itself unless it goes.
bool ReadValues(int fd, Range data, Range value, std::uint8_t* to, bool remove) {
    const auto before = static_cast<std::size_t>(value.offset - data.offset);
    const auto behind = static_cast<std::size_t>(data.end() - value.end());
    if (remove) {
        iovec first = {to, before};
        iovec second = {to + before, behind};
        return ReadParts(fd, &first, 1, data.offset) && ReadParts(fd, &second, 1, value.end());
    }
    iovec parts[] = {{to, before}, {to + before + behind, value.length}, {to + before, behind}};
    return ReadParts(fd, parts, 3, data.offset);
}

}  // namespace

int GatherValues(const EASHandle& h, Range data, unsigned index, std::uint8_t* to, bool remove) {
    const EASEntry& entry = h.entries[index];
    return ReadValues(h.fd, data, {entry.offset, entry.length}, to, remove) ? 0
                                                                            : unit.Fail(Err::kRead);
}

void MoveEntry(EASHandle* h, StreamHeader* header, unsigned index, bool remove) {
    Range& data = header->attributes.data;
    const std::span<EASEntry> attributes = Attributes(*h);
    const EASEntry moved = attributes[index];
    const auto at = attributes.begin() + static_cast<std::ptrdiff_t>(index);
    std::rotate(at, at + 1, attributes.end());
    EASEntry& last = attributes.back();
    for (std::size_t i = index; i + 1 < attributes.size(); ++i) {
        attributes[i].offset -= moved.length;
    }
    if (!remove) {
        last.offset = static_cast<std::uint32_t>(data.end() - moved.length);
        return;
    }
    const std::uint32_t record_size = RemovedRecordSize(moved.nameLength);
    for (EASEntry& entry : attributes) entry.offset -= record_size;
    data.offset -= record_size;
    data.length -= moved.length;
    --header->attributes.count;
    FreeEntry(&last);
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEASUpdateEntry(EASHandle* h, unsigned index, unsigned char* buf, unsigned bufSize,
                       int remove) {
    if (h == nullptr || h->fd < 0 || index >= Attributes(*h).size()) {
        return unit.Fail(Err::kBadArgument);
    }
    const bool drop = remove != 0;
    const std::uint32_t dropped = drop ? h->entries[index].length : 0;
    const std::uint32_t length = LoadHeader(*h).attributes.data.length;
    if (std::uint64_t{bufSize} + dropped < length) return unit.Fail(Err::kBufferMemory);
    if (buf == nullptr && bufSize > 0) return unit.Fail(Err::kBadArgument);
    Survey survey;
    if (SurveyTable(h, unit, &survey) != 0) return -1;
    if (GatherValues(*h, survey.header.attributes.data, index, buf, drop) != 0) return -1;
    MoveEntry(h, &survey.header, index, drop);
    StoreHeader(survey.header, h);
    return 0;
}

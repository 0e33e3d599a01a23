// Writes an attribute's value, durably. The attribute becomes the last one: its value goes behind
// all others, and the resource fork makes way.

#include <errno.h>
#include <string.h>

#include <algorithm>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/layout.h"
#include "util/file_io.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_write");

// Puts `image` on disk, the fork first: it still lies where the old header says while it moves.
int Commit(EASHandle* h, const StreamImage& image, std::uint64_t total_size, Range fork,
           Room* room) {
    const auto fork_start = static_cast<unsigned>(total_size);
    if (EASShiftRFork(h, fork_start, fork.offset, fork.length) != 0) return -1;
    if (image.Write(h->fd, unit) != 0) return -1;
    room->Keep();
    return MAVOEASFlush(h);
}

// Appends a new attribute. Whatever can fail before the disk changes comes first, memory last.
int Create(EASHandle* h, const char* name, ByteView value, unsigned offset) {
    Survey survey;
    Range fork;
    if (SurveyStream(h, unit, &survey, &fork) != 0) return -1;

    AttributeHeader& attributes = survey.header.attributes;
    const Range old_data = attributes.data;
    const auto name_size = static_cast<std::uint8_t>(strlen(name) + 1);
    const std::uint32_t record_size = RecordSize(name_size);
    const std::uint64_t length = std::uint64_t{offset} + value.size();
    const std::uint64_t total_size = old_data.end() + record_size + length;
    if (attributes.count == kAttributeCountMax || !IsValueLength(length) ||
        !FitsStream(total_size, fork.length)) {
        return unit.Fail(Err::kBadArgument);
    }

    auto own_name = Owned<char>::Allocate(name_size);
    StreamImage image(total_size);
    if (!own_name || !image.ok()) return unit.Fail(Err::kMemory);
    CopyShort(own_name.get(), name, name_size);
    if (attributes.count == h->capacity && MAVOEASAllocEntry(h, 0) != 0) return -1;

    attributes.data.offset += record_size;
    std::uint8_t* const data = image.At(attributes.data.offset);
    if (ReadAt(h->fd, {data, old_data.length}, old_data.offset) != old_data.length) {
        return unit.Fail(Err::kRead);
    }
    Room room;
    if (room.Reserve(h->fd, old_data.end() + fork.length, total_size + fork.length, unit) != 0) {
        return -1;
    }
    memset(data + old_data.length, 0, offset);
    std::copy(value.begin(), value.end(), data + old_data.length + offset);

    h->entries[attributes.count] = {
        .offset = static_cast<std::uint32_t>(old_data.end()),
        .length = static_cast<std::uint32_t>(length),
        .flags = 0,
        .nameLength = name_size,
        .name = own_name.Release(),
    };
    attributes.data.length += static_cast<std::uint32_t>(length);
    ++attributes.count;
    image.PutHead(survey.header, h, record_size);
    return Commit(h, image, total_size, fork, &room);
}

// Of a large stream the values before the one that is written stay where they are, and so does what
// is not written of that one when it is the last.
int Overwrite(EASHandle* h, unsigned index, ByteView value, unsigned offset) {
    Survey survey;
    Range fork;
    if (SurveyStream(h, unit, &survey, &fork) != 0) return -1;

    // A value never shrinks.
    Range& data = survey.header.attributes.data;
    const Range old = {h->entries[index].offset, h->entries[index].length};
    const std::uint64_t written_end = std::uint64_t{offset} + value.size();
    const std::uint64_t length = std::max(std::uint64_t{old.length}, written_end);
    const std::uint64_t added = length - old.length;
    const std::uint64_t total_size = data.end() + added;
    if (!IsValueLength(length) || !FitsStream(total_size, fork.length)) {
        return unit.Fail(Err::kBadArgument);
    }

    // What is written of the values.
    std::uint64_t from = data.offset;
    std::uint64_t to = total_size;
    const bool large = data.end() > kSmallStream;
    const bool last = index + 1U == survey.header.attributes.count;
    if (large) from = old.offset;
    if (large && last) {
        from += std::min(offset, old.length);
        to = old.offset + written_end;
    }
    StreamImage image(data.offset, from, to);
    if (!image.ok()) return unit.Fail(Err::kMemory);
    if (last) image.PutValuesFirst();
    if (!large || !last) {
        const Range moved = {static_cast<std::uint32_t>(from),
                             static_cast<std::uint32_t>(data.end() - from)};
        if (GatherValues(*h, moved, index, image.At(from), false) != 0) return -1;
    }
    Room room;
    if (room.Reserve(h->fd, data.end() + fork.length, total_size + fork.length, unit) != 0) {
        return -1;
    }
    if (added > 0) memset(image.At(data.end()), 0, static_cast<std::size_t>(added));
    std::copy(value.begin(), value.end(), image.At(data.end() - old.length + offset));

    MoveEntry(h, &survey.header, index, false);
    Attributes(*h).back().length = static_cast<std::uint32_t>(length);
    data.length += static_cast<std::uint32_t>(added);
    image.PutHead(survey.header, h);
    return Commit(h, image, total_size, fork, &room);
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASWrite(EASHandle* h, const char* name, const void* data, unsigned size, unsigned offset,
                 int flags) {
    if (h == nullptr || name == nullptr || h->fd < 0 || (data == nullptr && size > 0)) {
        return unit.Fail(Err::kBadArgument);
    }
    // A name that the record's one byte cannot count, a size that the result could not tell from a
    // failure.
    if (strlen(name) >= kNameSizeMax || !IsValueLength(size)) return unit.Fail(Err::kBadArgument);
    if (h->lockType != F_WRLCK) return unit.Fail(Err::kNotPermitted);

    const ByteView value(static_cast<const std::uint8_t*>(data), size);
    const int index = FindAttribute(*h, name);
    if (index < 0) {
        if ((flags & EAS_WRITE_MUST_EXIST) != 0) {
            errno = ENOENT;
            return -1;
        }
        if (Create(h, name, value, offset) != 0) return -1;
    } else {
        if ((flags & EAS_WRITE_OVERWRITE) == 0) {
            errno = EEXIST;
            return size > 0 ? -1 : 0;  // Writing nothing succeeds, whatever is there.
        }
        if (Overwrite(h, static_cast<unsigned>(index), value, offset) != 0) return -1;
    }
    return static_cast<int>(size);
}

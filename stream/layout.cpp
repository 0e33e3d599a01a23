#include "stream/layout.h"

#include <errno.h>

#include <algorithm>
#include <cstring>
#include <utility>

#include "stream/internal.h"
#include "util/file_io.h"

namespace mavoea {
namespace {

constexpr Unit header_unit("eas_write_header");

// Whether the last bytes of the first `size` of both are the same, where names that begin alike
// differ.
bool EndsAlike(const char* one, const char* other, std::size_t size) {
    std::uint64_t ends[2];
    if (size < sizeof ends[0]) return true;
    std::memcpy(&ends[0], one + size - sizeof ends[0], sizeof ends[0]);
    std::memcpy(&ends[1], other + size - sizeof ends[1], sizeof ends[1]);
    return ends[0] == ends[1];
}

}  // namespace

std::span<EASEntry> Attributes(const EASHandle& h) {
    return {h.entries, DecodeAttributeCount(h.header)};
}

int FindAttribute(const EASHandle& h, const char* name) {
    const std::size_t size = std::strlen(name) + 1;
    const std::span<EASEntry> attributes = Attributes(h);
    for (std::size_t i = attributes.size(); i-- > 0;) {
        const EASEntry& entry = attributes[i];
        if (EndsAlike(entry.name, name, std::min<std::size_t>(entry.nameLength, size)) &&
            std::strcmp(entry.name, name) == 0) {
            return static_cast<int>(i);
        }
    }
    return -1;
}

std::uint64_t TableEnd(const EASHandle& h) {
    std::uint64_t end = kStreamHeaderSize;
    for (const EASEntry& entry : Attributes(h)) end += RecordSize(entry.nameLength);
    return end;
}

Fit FitTogether(const EASHandle& h, Range data) {
    const std::span<EASEntry> attributes = Attributes(h);
    if (std::cmp_greater(attributes.size(), h.capacity)) return Fit::kNot;
    Fit fit = Fit::kAll;
    std::uint64_t table_end = kStreamHeaderSize;
    std::uint64_t next = data.offset;
    for (const EASEntry& entry : attributes) {
        if (entry.name == nullptr) return Fit::kNot;
        if (entry.offset != next) {
            if (entry.length != 0) return Fit::kNot;
            fit = Fit::kBarEmpty;
        }
        table_end += RecordSize(entry.nameLength);
        next += entry.length;
    }
    if (next != data.end() || data.offset < table_end) return Fit::kNot;
    return fit;
}

int SurveyTable(EASHandle* h, const Unit& unit, Survey* found, int line) {
    found->header = LoadHeader(*h);
    Range& data = found->header.attributes.data;
    found->file_size = data.end();
    // What a small stream lacks shows when it is read. What could be large, or has to move, must be
    // known to be there. Not with fstat(2): a file whose times have been looked at gets new ones
    // with its next write, which makes the sync behind that write cost half as much again.
    if (data.end() > kSmallStream || found->header.resource_fork.data.length != 0) {
        const off_t size = kernel::Lseek(h->fd, 0, SEEK_END);
        if (size < 0) return unit.Fail(Err::kRead, line);
        found->file_size = static_cast<std::uint64_t>(size);
    }

    const std::span<EASEntry> attributes = Attributes(*h);
    if (attributes.empty() && data.length == 0) {
        data.offset = kStreamHeaderSize;  // Whatever it was, nothing lies there.
        return 0;
    }
    const Fit fit = FitTogether(*h, data);
    if (fit == Fit::kNot || data.end() > found->file_size) return unit.Fail(Err::kRead, line);
    if (fit == Fit::kAll) return 0;
    std::uint64_t next = data.offset;
    for (EASEntry& entry : attributes) {
        entry.offset = static_cast<std::uint32_t>(next);
        next += entry.length;
    }
    return 0;
}

int SurveyFork(EASHandle* h, const Survey& survey, const Unit& unit, Range* fork, int line) {
    unsigned start = 0;
    unsigned length = 0;
    if (EASGetRForkRange(h, &start, &length) != 0) return -1;
    if (length != 0) {
        const AttributeHeader& attributes = survey.header.attributes;
        const bool plain = survey.header.finder_info.data.length == kFinderInfoSize;
        const std::uint64_t before = plain ? kAttributeHeaderOffset : attributes.data.end();
        if (survey.header.resource_fork.data.offset != start || start < before) {
            return unit.Fail(Err::kRead, line);
        }
        const std::uint64_t there = survey.file_size > start ? survey.file_size - start : 0;
        length = static_cast<unsigned>(std::min<std::uint64_t>(length, there));
    }
    *fork = {start, length};
    return 0;
}

int Room::Reserve(int fd, std::uint64_t from, std::uint64_t to, const Unit& unit, int line) {
    // What a volume gives room in; a file that ends within one has all of it.
    constexpr std::uint64_t kBlock = 512;
    from += (kBlock - from % kBlock) % kBlock;
    if (to <= from) return 0;
    if (kernel::Reserve(fd, static_cast<off_t>(from), static_cast<off_t>(to - from)) == 0) {
        fd_ = fd;
        return 0;
    }
    if (errno != ENOSPC && errno != EDQUOT && errno != EFBIG) return 0;
    fd_ = fd;  // The file may have got what there was.
    return unit.Fail(Err::kWrite, line);
}

Room::~Room() {
    if (fd_ < 0) return;
    const ErrnoKeeper keep;
    const off_t size = kernel::Lseek(fd_, 0, SEEK_END);
    if (size >= 0) (void)kernel::Ftruncate(fd_, size);
}

bool FitsStream(std::uint64_t total_size, std::uint32_t fork_length) {
    return total_size < kStreamSizeMax && total_size + fork_length <= kStreamSizeMax;
}

void StreamImage::PutHead(StreamHeader header, EASHandle* h, std::uint32_t moved) {
    AttributeHeader& attributes = header.attributes;
    attributes.total_size = static_cast<std::uint32_t>(attributes.data.end());
    // Wherever the file had its Finder info, the header has it here.
    if (header.finder_info.id == EntryId::kFinderInfo) {
        header.finder_info.data.offset = kFinderInfoOffset;
    }
    header.finder_info.data.length = attributes.total_size - header.finder_info.data.offset;
    header.resource_fork.data.offset = attributes.total_size;
    StoreHeader(header, h);

    std::memcpy(At(0), h->header, kStreamHeaderSize);
    std::uint8_t* to = At(kStreamHeaderSize);
    for (EASEntry& entry : Attributes(*h)) {
        entry.offset += moved;
        EncodeAttributeRecord({.value = {entry.offset, entry.length},
                               .flags = entry.flags,
                               .name_size = entry.nameLength},
                              entry.name, to);
        to += RecordSize(entry.nameLength);
    }
    const auto table_end = static_cast<std::uint64_t>(to - At(0));
    head_size_ = std::clamp<std::uint64_t>(attributes.data.offset, table_end, all().size());
    std::memset(to, 0, static_cast<std::size_t>(head_size_ - table_end));
}

// Nothing to do when the file has them.
int StreamImage::WriteHead(int fd) const {
    const std::size_t size = head().size();
    const auto there = Owned<std::uint8_t>::Allocate(size);
    if (there && ReadAt(fd, {there.get(), size}, 0) == static_cast<std::int64_t>(size) &&
        std::memcmp(there.get(), head().data(), size) == 0) {
        return 0;
    }
    return WriteAt(fd, head(), 0) == size ? 0 : header_unit.Fail(Err::kWrite);
}

int StreamImage::WriteValues(int fd, const Unit& unit, int line) const {
    const ByteView values = all().subspan(head().size());
    return WriteAt(fd, values, behind_) == values.size() ? 0 : unit.Fail(Err::kWrite, line);
}

int StreamImage::Write(int fd, const Unit& unit, int line) const {
    if (kept_ == 0) {
        const std::uint64_t written = WriteAt(fd, all(), 0);
        if (written == all().size()) return 0;
        return written < head_size_ ? header_unit.Fail(Err::kWrite) : unit.Fail(Err::kWrite, line);
    }
    if (values_first_ && WriteValues(fd, unit, line) != 0) return -1;
    if (WriteHead(fd) != 0) return -1;
    return values_first_ ? 0 : WriteValues(fd, unit, line);
}

}  // namespace mavoea

// Reads a stream's header and attribute table, with as few reads as that takes.

#include <string.h>

#include <algorithm>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/layout.h"
#include "util/file_io.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_open");

// Parts of a file by offset, out of one buffer that moves along. The first read takes most streams
// whole; what a damaged header declares never makes the buffer larger than the file, nor than
// kMost.
class FileWindow {
 public:
    FileWindow(int fd, std::uint64_t file_size) : fd_(fd), file_size_(file_size) {}

    // `size` bytes at `offset`, valid until the next call; none when the file ends before or cannot
    // be read.
    ByteView At(std::uint64_t offset, std::size_t size) {
        if (offset < start_ || offset + size > start_ + filled_) {
            if (offset + size > file_size_ || !MoveTo(offset, size)) return {};
        }
        return {buffer_ + (offset - start_), size};
    }

    // Lets the next read, when there has to be one, go on to here.
    void Expect(std::uint64_t end) { expected_ = end; }

    bool OutOfMemory() const { return out_of_memory_; }

 private:
    static constexpr std::size_t kFirst = 8192;
    static constexpr std::size_t kMost = std::size_t{1} << 20;

    bool MoveTo(std::uint64_t offset, std::size_t size) {
        const std::uint64_t end =
            std::min(file_size_, std::max({offset + size, offset + kFirst, expected_}));
        const auto want = static_cast<std::size_t>(std::min<std::uint64_t>(end - offset, kMost));
        if (want > capacity_) {
            more_ = Owned<std::uint8_t>::Allocate(want);
            filled_ = 0;
            if (!more_) {
                out_of_memory_ = true;
                return false;
            }
            buffer_ = more_.get();
            capacity_ = want;
        }
        const std::int64_t got = ReadAt(fd_, {buffer_, want}, offset);
        start_ = offset;
        filled_ = got < 0 ? 0 : static_cast<std::size_t>(got);
        return filled_ >= size;
    }

    int fd_;
    std::uint64_t file_size_;
    std::uint64_t expected_ = 0;
    std::uint64_t start_ = 0;
    std::size_t filled_ = 0;
    std::size_t capacity_ = kFirst;
    bool out_of_memory_ = false;
    Owned<std::uint8_t> more_;
    std::uint8_t first_[kFirst];
    std::uint8_t* buffer_ = first_;
};

int ReadHeader(FileWindow& file, StreamHeader* header) {
    ByteView bytes = file.At(0, AppleDoubleHeader::kSize);
    if (bytes.empty()) return unit.Fail(Err::kRead);
    BeReader in(bytes);
    header->file = DecodeAppleDoubleHeader(in);
    const std::uint16_t count = header->file.entry_count;
    if (count > kStreamDescriptorMax) return unit.Fail(Err::kBadArgument);

    bytes = file.At(0, DescriptorsEnd(count));
    if (bytes.empty()) return unit.Fail(Err::kRead);
    BeReader descriptors(bytes.subspan(AppleDoubleHeader::kSize));
    for (std::uint16_t i = 0; i < count; ++i) {
        const EntryDescriptor entry = DecodeEntryDescriptor(descriptors);
        if (entry.id == EntryId::kFinderInfo) header->finder_info = entry;
        if (entry.id == EntryId::kResourceFork) header->resource_fork = entry;
    }

    bytes = file.At(header->finder_info.data.offset, kFinderInfoSize);
    if (bytes.empty()) return unit.Fail(Err::kRead);
    BeReader(bytes).Copy(header->finder_info_bytes);

    if (header->finder_info.data.length == kFinderInfoSize) {
        header->attributes = NoAttributes();
        return 0;
    }
    bytes = file.At(kAttributeHeaderOffset, kAttributeHeaderSize);
    return DecodeAttributeHeader(bytes, &header->attributes) ? 0 : unit.Fail(Err::kRead);
}

// Reads one record at *at, and moves on behind it.
int ReadRecord(FileWindow& file, std::uint64_t* at, EASEntry* entry) {
    AttributeRecord record;
    if (!DecodeAttributeRecord(file.At(*at, AttributeRecord::kFixedSize), &record)) {
        return unit.Fail(file.OutOfMemory() ? Err::kMemory : Err::kRead);
    }
    const std::size_t size = AttributeRecord::kFixedSize + record.name_size;
    const ByteView bytes = file.At(*at, size);
    if (bytes.empty()) return unit.Fail(file.OutOfMemory() ? Err::kMemory : Err::kRead);

    auto name = Owned<char>::Allocate(record.name_size + 1U);
    if (!name) return unit.Fail(Err::kMemory);
    memcpy(name.get(), bytes.data() + AttributeRecord::kFixedSize, record.name_size);
    name.get()[record.name_size] = '\0';
    *entry = {.offset = record.value.offset,
              .length = record.value.length,
              .flags = record.flags,
              .nameLength = record.name_size,
              .name = name.Release()};
    *at += RecordSize(record.name_size);
    return 0;
}

// The file's size, -1 after recording why it could not be told.
std::int64_t FileSize(int fd) {
    const off_t size = kernel::Lseek(fd, 0, SEEK_END);
    return size < 0 ? unit.Fail(Err::kRead) : std::int64_t{size};
}

int Load(EASHandle* h) {
    const std::int64_t file_size = FileSize(h->fd);
    if (file_size < 0) return -1;
    if (file_size == 0) {
        StoreHeader(NewStreamHeader(), h);
        return MAVOEASAllocEntry(h, 0);
    }
    FileWindow file(h->fd, static_cast<std::uint64_t>(file_size));
    StreamHeader header;
    if (ReadHeader(file, &header) != 0) return -1;
    StoreHeader(header, h);

    const AttributeHeader& attributes = header.attributes;
    const auto most = static_cast<std::uint64_t>(file_size);
    if (attributes.count != 0 && kStreamHeaderSize + SmallestTable(attributes.count) > most) {
        return unit.Fail(Err::kRead);
    }
    if (MAVOEASAllocEntry(h, attributes.count) != 0) return -1;
    file.Expect(attributes.data.offset);
    std::uint64_t at = kStreamHeaderSize;
    for (std::uint16_t i = 0; i < attributes.count; ++i) {
        if (ReadRecord(file, &at, &h->entries[i]) != 0) return -1;
    }
    return 0;
}

}  // namespace

int EASGetEntryCount(int fd) {
    if (fd < 0) return unit.Fail(Err::kBadArgument);
    EASHandle h = {};
    h.fd = fd;
    h.lockType = F_UNLCK;
    if (MAVOEASLockSet(&h, F_RDLCK) != 0) return -1;

    int count = 0;
    const std::int64_t file_size = FileSize(fd);
    if (file_size < 0) {
        count = -1;
    } else if (file_size > 0) {
        FileWindow file(fd, static_cast<std::uint64_t>(file_size));
        StreamHeader header;
        count = ReadHeader(file, &header) == 0 ? header.attributes.count : -1;
    }
    const ErrnoKeeper keep;
    (void)MAVOEASLockSet(&h, F_UNLCK);
    return count;
}

}  // namespace mavoea

using namespace mavoea;

EASHandle* MAVOEASOpen(int fd, int lockType) {
    if (fd < 0) {
        unit.Fail(Err::kBadArgument);
        return nullptr;
    }
    auto h = Owned<EASHandle>::AllocateZeroed(1);
    if (!h) {
        unit.Fail(Err::kMemory);
        return nullptr;
    }
    h->fd = fd;
    h->lockType = F_UNLCK;
    if (MAVOEASLockSet(h.get(), lockType) != 0) return nullptr;
    if (Load(h.get()) != 0) {
        const ErrnoKeeper keep;
        FreeTable(h.get());
        if (h->lockType != F_UNLCK) (void)MAVOEASLockSet(h.get(), F_UNLCK);
        return nullptr;
    }
    return h.Release();
}

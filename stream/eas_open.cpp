// Reads a stream's header and attribute table, with as few reads as that takes.

#include <string.h>

#include <algorithm>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/layout.h"
#include "stream/open_stream.h"
#include "util/file_io.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_open");

// The file's size, -1 after recording why it could not be told.
std::int64_t FileSize(int fd) {
    const off_t size = kernel::Lseek(fd, 0, SEEK_END);
    return size < 0 ? unit.Fail(Err::kRead) : std::int64_t{size};
}

// How a file begins, read once: most streams whole.
class FirstBytes {
 public:
    FirstBytes(int fd, std::uint64_t file_size) : fd_(fd) {
        const auto want = static_cast<std::size_t>(std::min<std::uint64_t>(file_size, kMost));
        const std::int64_t got = ReadAt(fd, {bytes_, want}, 0);
        size_ = got < 0 ? 0 : static_cast<std::size_t>(got);
    }

    // Fills `to` with the file's bytes at `offset`. What is not here is read by itself: more than
    // was needed may have been what could not be read.
    bool Copy(std::uint64_t offset, ByteSpan to) const {
        if (offset > size_ || to.size() > size_ - offset) {
            return ReadAt(fd_, to, offset) == static_cast<std::int64_t>(to.size());
        }
        std::copy_n(bytes_ + offset, to.size(), to.begin());
        return true;
    }

    // Those that are here from `offset` on.
    ByteView From(std::size_t offset) const {
        return ByteView(bytes_, size_).subspan(std::min(offset, size_));
    }

 private:
    static constexpr std::size_t kMost = 8192;

    int fd_;
    std::size_t size_ = 0;
    std::uint8_t bytes_[kMost];
};

int ReadHeader(const FirstBytes& first, StreamHeader* header) {
    std::uint8_t file[AppleDoubleHeader::kSize];
    if (!first.Copy(0, file)) return unit.Fail(Err::kRead);
    BeReader in(file);
    header->file = DecodeAppleDoubleHeader(in);
    const std::uint16_t count = header->file.entry_count;
    if (count > kStreamDescriptorMax) return unit.Fail(Err::kBadArgument);

    std::uint8_t entries[kStreamDescriptorMax * EntryDescriptor::kSize];
    const ByteSpan listed(entries, count * EntryDescriptor::kSize);
    if (!first.Copy(AppleDoubleHeader::kSize, listed)) return unit.Fail(Err::kRead);
    BeReader descriptors(listed);
    for (std::uint16_t i = 0; i < count; ++i) {
        const EntryDescriptor entry = DecodeEntryDescriptor(descriptors);
        if (entry.id == EntryId::kFinderInfo) header->finder_info = entry;
        if (entry.id == EntryId::kResourceFork) header->resource_fork = entry;
    }

    const Range finder_info = header->finder_info.data;
    if (!first.Copy(finder_info.offset, header->finder_info_bytes)) return unit.Fail(Err::kRead);
    if (finder_info.length == kFinderInfoSize) {
        header->attributes = NoAttributes();
        return 0;
    }
    std::uint8_t attributes[kAttributeHeaderSize];
    return first.Copy(kAttributeHeaderOffset, attributes) &&
                   DecodeAttributeHeader(attributes, &header->attributes)
               ? 0
               : unit.Fail(Err::kRead);
}

// The attribute table while it is read: its bytes from kStreamHeaderSize on, as many as its records
// turn out to take.
class TableReader {
 public:
    TableReader(int fd, std::uint64_t file_size, const FirstBytes& first)
        : fd_(fd), most_(file_size - kStreamHeaderSize), first_(first) {}

    // Reads `count` records, which the header says end at `end`. What it says decides how much is
    // read at once and nothing else: never more than the file has, and little more than is needed.
    int Read(std::uint16_t count, std::uint64_t end) {
        const std::uint64_t likely = end > kStreamHeaderSize ? end - kStreamHeaderSize : 0;
        std::uint64_t at = 0;
        for (std::uint16_t i = 0; i < count; ++i) {
            if (!Reach(at + AttributeRecord::kFixedSize, likely)) return Refuse();
            AttributeRecord record;
            DecodeAttributeRecord({table_.get() + at, AttributeRecord::kFixedSize}, &record);
            if (!Reach(at + AttributeRecord::kFixedSize + record.name_size, likely)) {
                return Refuse();
            }
            at += RecordSize(record.name_size);
        }
        GiveBack(at);
        return 0;
    }

    std::size_t size() const { return size_; }
    std::uint8_t* Release() { return table_.Release(); }

 private:
    static constexpr std::uint64_t kStep = std::uint64_t{1} << 16;

    // Whether `size` bytes of the table are here, or could be read.
    bool Reach(std::uint64_t size, std::uint64_t likely) {
        if (size <= size_) return true;
        if (size > most_) return false;
        std::uint64_t want = size;
        if (!only_needed_) {
            want = likely >= size ? std::min(likely, size_ + 16 * kStep) : size + kStep;
        }
        want = std::min(want, most_);
        void* const larger = kernel::Reallocate(table_.get(), want);
        if (larger == nullptr) {
            out_of_memory_ = true;
            return false;
        }
        (void)table_.Release();
        table_ = Owned<std::uint8_t>(static_cast<std::uint8_t*>(larger));
        if (size_ == 0) {
            const ByteView here = first_.From(kStreamHeaderSize);
            size_ = static_cast<std::size_t>(std::min<std::uint64_t>(here.size(), want));
            memcpy(table_.get(), here.data(), size_);
        }
        if (size_ < want && !ReadTo(want)) {
            only_needed_ = true;
            if (size_ < size && !ReadTo(size)) return false;
        }
        return size <= size_;
    }

    // Reads the table on up to `end`, or as far as the file goes.
    bool ReadTo(std::uint64_t end) {
        const std::int64_t got =
            ReadAt(fd_, {table_.get() + size_, static_cast<std::size_t>(end - size_)},
                   kStreamHeaderSize + size_);
        if (got < 0) return false;
        size_ += static_cast<std::size_t>(got);
        return true;
    }

    // Frees what a header that says too much has had read.
    void GiveBack(std::uint64_t used) {
        if (size_ <= used + kStep) return;
        void* const smaller = kernel::Reallocate(table_.get(), used);
        if (smaller == nullptr) return;
        (void)table_.Release();
        table_ = Owned<std::uint8_t>(static_cast<std::uint8_t*>(smaller));
        size_ = static_cast<std::size_t>(used);
    }

    int Refuse() const { return unit.Fail(out_of_memory_ ? Err::kMemory : Err::kRead); }

    int fd_;
    std::uint64_t most_;
    const FirstBytes& first_;
    Owned<std::uint8_t> table_;
    std::size_t size_ = 0;
    bool only_needed_ = false;  // More than that could not be read.
    bool out_of_memory_ = false;
};

// The name of a record of the table as read: where it lies when it ends in a NUL, as all but
// damaged ones do, else a copy that does; nullptr when memory ran out.
char* NameOf(std::uint8_t* bytes, std::uint8_t size) {
    if (size > 0 && bytes[size - 1] == '\0') return reinterpret_cast<char*>(bytes);
    auto* const name = static_cast<char*>(kernel::Allocate(size + 1ULL));
    if (name == nullptr) return nullptr;
    memcpy(name, bytes, size);
    name[size] = '\0';
    return name;
}

int LoadTable(EASHandle* h, std::uint64_t file_size, const FirstBytes& first,
              const AttributeHeader& attributes) {
    const std::uint16_t count = attributes.count;
    if (count != 0 && kStreamHeaderSize + SmallestTable(count) > file_size) {
        return unit.Fail(Err::kRead);
    }
    if (MAVOEASAllocEntry(h, count) != 0) return -1;
    if (count == 0) return 0;
    TableReader reader(h->fd, file_size, first);
    if (reader.Read(count, attributes.data.offset) != 0) return -1;

    OpenStream* const stream = StreamOf(h);
    stream->table_size = reader.size();
    stream->table = reader.Release();
    std::uint8_t* at = stream->table;
    for (std::uint16_t i = 0; i < count; ++i) {
        AttributeRecord record;
        DecodeAttributeRecord({at, AttributeRecord::kFixedSize}, &record);
        char* const name = NameOf(at + AttributeRecord::kFixedSize, record.name_size);
        if (name == nullptr) return unit.Fail(Err::kMemory);
        h->entries[i] = {.offset = record.value.offset,
                         .length = record.value.length,
                         .flags = record.flags,
                         .nameLength = record.name_size,
                         .name = name};
        at += RecordSize(record.name_size);
    }
    return 0;
}

int Load(EASHandle* h) {
    const std::int64_t size = FileSize(h->fd);
    if (size < 0) return -1;
    if (size == 0) {
        StoreHeader(NewStreamHeader(), h);
        return MAVOEASAllocEntry(h, 0);
    }
    const auto file_size = static_cast<std::uint64_t>(size);
    const FirstBytes first(h->fd, file_size);
    StreamHeader header;
    if (ReadHeader(first, &header) != 0) return -1;
    StoreHeader(header, h);
    return LoadTable(h, file_size, first, header.attributes);
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
        const FirstBytes first(fd, static_cast<std::uint64_t>(file_size));
        StreamHeader header;
        count = ReadHeader(first, &header) == 0 ? header.attributes.count : -1;
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
    auto stream = Owned<OpenStream>::AllocateZeroed(1);
    if (!stream) {
        unit.Fail(Err::kMemory);
        return nullptr;
    }
    EASHandle* const h = &stream->handle;
    h->fd = fd;
    h->lockType = F_UNLCK;
    if (MAVOEASLockSet(h, lockType) != 0) return nullptr;
    const bool loaded = Load(h) == 0;
    (void)stream.Release();
    if (loaded) return h;
    const ErrnoKeeper keep;
    if (h->lockType != F_UNLCK) (void)MAVOEASLockSet(h, F_UNLCK);
    FreeStream(h);
    return nullptr;
}

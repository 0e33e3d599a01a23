// Reads a stream's header and attribute table, with as few reads as that takes.

#include <errno.h>
#include <string.h>

#include <algorithm>
#include <utility>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "stream/internal.h"
#include "stream/large_block.h"
#include "stream/layout.h"
#include "stream/names.h"
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

// How a file begins, read once: most streams whole, so that nobody need ask how large they are.
class FirstBytes {
 public:
    explicit FirstBytes(int fd) : fd_(fd) {
        ssize_t got;
        do {
            got = kernel::Pread(fd, bytes_, kMost, 0);
        } while (got < 0 && errno == EINTR);
        size_ = got < 0 ? 0 : static_cast<std::size_t>(got);
    }

    // 1 when the file is empty, else 0; -1 after recording why it could not be told. A file that
    // does not let itself be read is asked: it must not be taken for a new one.
    int IsFileEmpty() const {
        if (size_ > 0) return 0;
        const std::int64_t file_size = FileSize(fd_);
        return file_size < 0 ? -1 : file_size == 0 ? 1 : 0;
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
    std::size_t size_;
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
    // The header says that the table ends at `end`. What it says decides how much is read at once
    // and nothing else: never more than the file has, and little more than is needed.
    TableReader(int fd, const FirstBytes& first, std::uint64_t end)
        : fd_(fd),
          likely_(end > kStreamHeaderSize ? end - kStreamHeaderSize : 0),
          here_(first.From(kStreamHeaderSize)) {}
    ~TableReader() { FreeBlock(block_); }
    TableReader(const TableReader&) = delete;
    TableReader& operator=(const TableReader&) = delete;

    // Whether the table's first `size` bytes are here, or could be read.
    bool Reach(std::uint64_t size) { return size <= here_.size() || Read(size); }
    const std::uint8_t* At(std::uint64_t offset) const { return here_.data() + offset; }

    // Reach() has failed.
    int Refuse() const { return unit.Fail(out_of_memory_ ? Err::kMemory : Err::kRead); }

    // The first `size` bytes in a block for names, which is the caller's. nullptr when memory ran
    // out.
    NameBlock* Release(std::uint64_t size) {
        // What a header that says too much has had read is given back.
        if (block_ == nullptr || here_.size() > size + kStep) {
            NameBlock* const block = ResizeNameBlock(block_, size);
            if (block == nullptr) return nullptr;
            // The file may end before the last record's padding.
            if (block_ == nullptr) {
                memcpy(block->bytes(), here_.data(), std::min(block->size, here_.size()));
            }
            block_ = block;
        }
        return std::exchange(block_, nullptr);
    }

 private:
    static constexpr std::uint64_t kStep = std::uint64_t{1} << 16;

    bool LearnFileSize() {
        const off_t size = kernel::Lseek(fd_, 0, SEEK_END);
        if (size < off_t{kStreamHeaderSize}) return false;
        file_size_ = static_cast<std::uint64_t>(size);
        return true;
    }

    bool Read(std::uint64_t size) {
        if (file_size_ == 0 && !LearnFileSize()) return false;
        const std::uint64_t most = file_size_ - kStreamHeaderSize;
        if (size > most) return false;
        const std::uint64_t want =
            likely_ >= size ? std::min(likely_, here_.size() + 16 * kStep) : size + kStep;
        NameBlock* const block = ResizeNameBlock(block_, std::min(want, most));
        out_of_memory_ = block == nullptr;
        if (out_of_memory_) return false;
        if (block_ == nullptr) memcpy(block->bytes(), here_.data(), here_.size());
        block_ = block;
        here_ = {block->bytes(), here_.size()};
        // More than what is needed may have been what could not be read.
        return (ReadTo(block->size) || ReadTo(size)) && size <= here_.size();
    }

    // Reads the table on up to `end`, or as far as the file goes.
    bool ReadTo(std::uint64_t end) {
        const std::size_t from = here_.size();
        const std::int64_t got =
            ReadAt(fd_, {block_->bytes() + from, static_cast<std::size_t>(end - from)},
                   kStreamHeaderSize + from);
        if (got < 0) return false;
        here_ = {block_->bytes(), from + static_cast<std::size_t>(got)};
        return true;
    }

    int fd_;
    std::uint64_t file_size_ = 0;  // once it is asked for
    std::uint64_t likely_;
    ByteView here_;
    NameBlock* block_ = nullptr;  // where they are once more than the first bytes are needed
    bool out_of_memory_ = false;
};

// A copy of a record's name that ends in a NUL, as damaged ones do not; nullptr when memory ran
// out.
char* CopyName(const std::uint8_t* bytes, std::uint8_t size) {
    auto* const name = static_cast<char*>(kernel::Allocate(size + 1ULL));
    if (name == nullptr) return nullptr;
    CopyShort(name, bytes, size);
    name[size] = '\0';
    return name;
}

// Gives the records their names, from the table's bytes. With `in_place` those stay, and the names
// that end in a NUL stay in them. False when memory ran out.
bool SetNames(std::span<EASEntry> attributes, const std::uint8_t* table, bool in_place) {
    for (EASEntry& entry : attributes) {
        const std::uint8_t* const name = table + AttributeRecord::kFixedSize;
        const std::uint8_t size = entry.nameLength;
        entry.name = in_place && size > 0 && name[size - 1] == '\0'
                         ? const_cast<char*>(reinterpret_cast<const char*>(name))
                         : CopyName(name, size);
        if (entry.name == nullptr) return false;
        table += RecordSize(size);
    }
    return true;
}

int LoadTable(EASHandle* h, const FirstBytes& first, const AttributeHeader& attributes) {
    const std::uint16_t count = attributes.count;
    TableReader table(h->fd, first, attributes.data.offset);
    // A file that cannot have as many does not make the entry table large.
    if (!table.Reach(SmallestTable(count))) return table.Refuse();
    if (MAVOEASAllocEntry(h, count) != 0) return -1;
    if (count == 0) return 0;

    std::uint64_t at = 0;
    for (EASEntry& entry : Attributes(*h)) {
        if (!table.Reach(at + AttributeRecord::kFixedSize)) return table.Refuse();
        AttributeRecord record;
        DecodeAttributeRecord({table.At(at), AttributeRecord::kFixedSize}, &record);
        if (!table.Reach(at + AttributeRecord::kFixedSize + record.name_size)) {
            return table.Refuse();
        }
        entry = {.offset = record.value.offset,
                 .length = record.value.length,
                 .flags = record.flags,
                 .nameLength = record.name_size,
                 .name = nullptr};
        at += RecordSize(record.name_size);
    }
    if (count <= kOwnNamesMax) {
        return SetNames(Attributes(*h), table.At(0), false) ? 0 : unit.Fail(Err::kMemory);
    }
    NameBlock* const block = table.Release(at);
    if (block == nullptr) return unit.Fail(Err::kMemory);
    KeepNameBlock(block, h->entries);
    return SetNames(Attributes(*h), block->bytes(), true) ? 0 : unit.Fail(Err::kMemory);
}

int Load(EASHandle* h) {
    const FirstBytes first(h->fd);
    const int empty = first.IsFileEmpty();
    if (empty < 0) return -1;
    if (empty != 0) {
        StoreHeader(NewStreamHeader(), h);
        return MAVOEASAllocEntry(h, 0);
    }
    StreamHeader header;
    if (ReadHeader(first, &header) != 0) return -1;
    StoreHeader(header, h);
    return LoadTable(h, first, header.attributes);
}

}  // namespace

int EASGetEntryCount(int fd) {
    if (fd < 0) return unit.Fail(Err::kBadArgument);
    EASHandle h = {};
    h.fd = fd;
    h.lockType = F_UNLCK;
    if (MAVOEASLockSet(&h, F_RDLCK) != 0) return -1;

    const FirstBytes first(fd);
    const int empty = first.IsFileEmpty();
    int count = empty < 0 ? -1 : 0;
    if (empty == 0) {
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
    auto stream = Owned<EASHandle>::AllocateZeroed(1);
    if (!stream) {
        unit.Fail(Err::kMemory);
        return nullptr;
    }
    stream->fd = fd;
    stream->lockType = F_UNLCK;
    if (MAVOEASLockSet(stream.get(), lockType) != 0) return nullptr;
    EASHandle* const h = stream.Release();
    if (Load(h) == 0) return h;
    const ErrnoKeeper keep;
    if (h->lockType != F_UNLCK) (void)MAVOEASLockSet(h, F_UNLCK);
    FreeStream(h);
    return nullptr;
}

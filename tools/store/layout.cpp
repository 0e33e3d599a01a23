#include "tools/store/layout.h"

#include <algorithm>
#include <functional>

namespace mavoea::tool {
namespace {

// The largest record there is, for the bound on the table.
constexpr std::uint64_t kRecordSizeMax = RecordSize(kNameSizeMax);

// Gives what there is of `size` bytes at `offset`.
using Source = std::function<Bytes(std::uint64_t offset, std::uint64_t size)>;

void ReadEntries(const Source& read, Layout* layout) {
    const std::uint16_t count = layout->header->entry_count;
    const Bytes bytes =
        read(AppleDoubleHeader::kSize, DescriptorsEnd(count) - AppleDoubleHeader::kSize);
    BeReader in(bytes);
    for (std::uint16_t i = 0; i < count; ++i) {
        const EntryDescriptor entry = DecodeEntryDescriptor(in);
        if (!in.ok()) return;
        layout->entries.push_back(entry);
    }
}

void ReadRecords(const Source& read, Layout* layout) {
    const std::uint16_t count = layout->attributes->count;
    const Bytes table = read(kStreamHeaderSize, count * kRecordSizeMax);
    const ByteView bytes(table);
    std::uint64_t at = 0;
    for (std::uint16_t i = 0; i < count && at < bytes.size(); ++i) {
        const ByteView rest = bytes.subspan(static_cast<std::size_t>(at));
        Layout::Record record;
        if (!DecodeAttributeRecord(rest, &record.fixed)) return;
        const std::size_t size = AttributeRecord::kFixedSize + record.fixed.name_size;
        if (size > rest.size()) return;
        const ByteView name = rest.first(size).last(record.fixed.name_size);
        record.at = kStreamHeaderSize + at;
        record.stored_name.assign(name.begin(), name.end());
        at += RecordSize(record.fixed.name_size);
        layout->records.push_back(std::move(record));
    }
}

// What ReadLayout() shows of an entry's bytes.
bool IsShown(EntryId id) {
    switch (static_cast<std::uint32_t>(id)) {
        case 3:
        case 4:
        case 8:
        case 13:
        case 14:
            return true;
        default:
            return SlotOf(static_cast<std::uint32_t>(id)) >= Slot::kPrivateDevice;
    }
}

void ReadContents(const Source& read, Layout* layout) {
    constexpr std::uint32_t kMost = 256;
    for (std::size_t i = 0; i < layout->entries.size() && i < Layout::kContentsMax; ++i) {
        const EntryDescriptor& entry = layout->entries[i];
        if (entry.data.length == 0 || !IsShown(entry.id)) continue;
        layout->contents[i] = read(entry.data.offset, std::min(entry.data.length, kMost));
    }
}

Layout ReadLayout(const Source& read, std::uint64_t size) {
    Layout layout;
    layout.file_size = size;
    const Bytes head = read(0, AppleDoubleHeader::kSize);
    BeReader in(head);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    if (!in.ok()) return layout;
    layout.header = header;
    if (!layout.IsAppleDouble()) return layout;

    ReadEntries(read, &layout);
    ReadContents(read, &layout);
    const auto finder_info = layout.FindEntry(EntryId::kFinderInfo);
    if (!finder_info) return layout;
    const Range range = layout.entries[*finder_info].data;
    if (range.length >= kFinderInfoSize) {
        Bytes bytes = read(range.offset, kFinderInfoSize);
        if (bytes.size() == kFinderInfoSize) layout.finder_info = std::move(bytes);
    }
    if (!layout.HasAttributeArea()) return layout;

    AttributeHeader attributes;
    if (!DecodeAttributeHeader(read(kAttributeHeaderOffset, kAttributeHeaderSize), &attributes)) {
        return layout;
    }
    layout.attributes = attributes;
    if (attributes.magic == kAttributeMagic) ReadRecords(read, &layout);
    return layout;
}

}  // namespace

std::optional<std::size_t> Layout::FindEntry(EntryId id) const {
    for (std::size_t i = entries.size(); i-- > 0;) {
        if (entries[i].id == id) return i;
    }
    return std::nullopt;
}

bool Layout::HasAttributeArea() const {
    const auto index = FindEntry(EntryId::kFinderInfo);
    return index && entries[*index].data.length > kFinderInfoSize;
}

std::uint64_t Layout::TableEnd() const {
    if (records.empty()) return kStreamHeaderSize;
    return records.back().at + RecordSize(records.back().fixed.name_size);
}

std::uint64_t Layout::EndBeforeFork() const {
    const auto fork = FindEntry(EntryId::kResourceFork);
    std::uint64_t end = DescriptorsEnd(header ? header->entry_count : std::uint16_t{0});
    for (std::size_t i = 0; i < entries.size(); ++i) {
        if (i != fork && entries[i].data.length > 0) end = std::max(end, entries[i].data.end());
    }
    if (attributes) {
        end = std::max(
            {end, std::uint64_t{attributes->total_size}, attributes->data.end(), TableEnd()});
        for (const Record& record : records) {
            if (record.fixed.value.length > 0) end = std::max(end, record.fixed.value.end());
        }
    }
    return end;
}

Layout ReadLayout(const File& file) {
    return ReadLayout(
        [&](std::uint64_t offset, std::uint64_t size) { return file.Read(offset, size); },
        file.Size());
}

Layout ReadLayout(ByteView bytes) {
    return ReadLayout(
        [&](std::uint64_t offset, std::uint64_t size) {
            if (offset >= bytes.size()) return Bytes();
            const auto from = static_cast<std::size_t>(offset);
            const auto count =
                static_cast<std::size_t>(std::min<std::uint64_t>(size, bytes.size() - from));
            const ByteView part = bytes.subspan(from, count);
            return Bytes(part.begin(), part.end());
        },
        bytes.size());
}

const char* EntryName(EntryId id) {
    switch (static_cast<std::uint32_t>(id)) {
        case 1:
            return "data fork";
        case 2:
            return "resource fork";
        case 3:
            return "real name";
        case 4:
            return "comment";
        case 5:
            return "icon, black and white";
        case 6:
            return "icon, colour";
        case 8:
            return "file dates";
        case 9:
            return "Finder info";
        case 10:
            return "Macintosh file info";
        case 11:
            return "ProDOS file info";
        case 12:
            return "MS-DOS file info";
        case 13:
            return "AFP short name";
        case 14:
            return "AFP file info";
        case 15:
            return "AFP directory id";
        default:
            break;
    }
    switch (SlotOf(static_cast<std::uint32_t>(id))) {
        case Slot::kPrivateDevice:
            return "private device";
        case Slot::kPrivateInode:
            return "private inode";
        case Slot::kPrivateSync:
            return "private sync";
        case Slot::kPrivateId:
            return "private id";
        default:
            return "unknown";
    }
}

}  // namespace mavoea::tool

#include "tools/layout.h"

#include <algorithm>

namespace mavoea::tool {
namespace {

// The largest record there is, for the bound on the table.
constexpr std::uint64_t kRecordSizeMax = RecordSize(kNameSizeMax);

void ReadEntries(const File& file, Layout* layout) {
    const std::uint16_t count = layout->header->entry_count;
    const Bytes bytes =
        file.Read(AppleDoubleHeader::kSize, DescriptorsEnd(count) - AppleDoubleHeader::kSize);
    BeReader in(bytes);
    for (std::uint16_t i = 0; i < count; ++i) {
        const EntryDescriptor entry = DecodeEntryDescriptor(in);
        if (!in.ok()) return;
        layout->entries.push_back(entry);
    }
}

void ReadRecords(const File& file, Layout* layout) {
    const std::uint16_t count = layout->attributes->count;
    const Bytes table = file.Read(kStreamHeaderSize, count * kRecordSizeMax);
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
    Layout layout;
    layout.file_size = file.Size();
    const Bytes head = file.Read(0, AppleDoubleHeader::kSize);
    BeReader in(head);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    if (!in.ok()) return layout;
    layout.header = header;
    if (!layout.IsAppleDouble()) return layout;

    ReadEntries(file, &layout);
    const auto finder_info = layout.FindEntry(EntryId::kFinderInfo);
    if (!finder_info) return layout;
    const Range range = layout.entries[*finder_info].data;
    if (range.length >= kFinderInfoSize) {
        Bytes bytes = file.Read(range.offset, kFinderInfoSize);
        if (bytes.size() == kFinderInfoSize) layout.finder_info = std::move(bytes);
    }
    if (!layout.HasAttributeArea()) return layout;

    AttributeHeader attributes;
    if (!DecodeAttributeHeader(file.Read(kAttributeHeaderOffset, kAttributeHeaderSize),
                               &attributes)) {
        return layout;
    }
    layout.attributes = attributes;
    if (attributes.magic == kAttributeMagic) ReadRecords(file, &layout);
    return layout;
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
            return "unknown";
    }
}

}  // namespace mavoea::tool

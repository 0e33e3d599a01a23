#include "format/apple_single.h"

namespace mavoea {

SingleEntry AppleSingle::entry(std::uint16_t index) const {
    BeReader in(descriptors_.subspan(index * EntryDescriptor::kSize, EntryDescriptor::kSize));
    const EntryDescriptor descriptor = DecodeEntryDescriptor(in);
    return {static_cast<std::uint32_t>(descriptor.id), descriptor.data};
}

std::optional<Range> AppleSingle::Find(std::uint32_t id) const {
    for (std::uint16_t index = 0; index < count_; ++index) {
        const SingleEntry found = entry(index);
        if (found.id == id) return found.data;
    }
    return std::nullopt;
}

std::optional<AppleSingle> DecodeAppleSingle(ByteView head, std::uint64_t file_size) {
    BeReader in(head);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    if (!in.ok() || header.magic != kAppleSingleMagic) return std::nullopt;
    if (header.version != kAppleDoubleVersion1 && header.version != kAppleDoubleVersion2) {
        return std::nullopt;
    }
    const std::size_t end = DescriptorsEnd(header.entry_count);
    if (end > head.size()) return std::nullopt;
    AppleSingle single;
    single.version_ = header.version;
    single.count_ = header.entry_count;
    single.descriptors_ = head.first(end).subspan(AppleDoubleHeader::kSize);
    for (std::uint16_t index = 0; index < single.count_; ++index) {
        if (single.entry(index).data.end() > file_size) return std::nullopt;
    }
    return single;
}

bool EncodeAppleSingleHead(std::span<SingleEntry> entries, ByteSpan head) {
    if (entries.size() > UINT16_MAX) return false;
    const auto count = static_cast<std::uint16_t>(entries.size());
    if (head.size() != DescriptorsEnd(count)) return false;
    std::uint64_t offset = head.size();
    for (SingleEntry& entry : entries) {
        if (offset + entry.data.length > UINT32_MAX) return false;
        entry.data.offset = static_cast<std::uint32_t>(offset);
        offset += entry.data.length;
    }
    BeWriter out(head);
    EncodeAppleDoubleHeader({.magic = kAppleSingleMagic,
                             .version = kAppleDoubleVersion2,
                             .filler = {},
                             .entry_count = count},
                            out);
    for (const SingleEntry& entry : entries) {
        EncodeEntryDescriptor({static_cast<EntryId>(entry.id), entry.data}, out);
    }
    return true;
}

}  // namespace mavoea

#include "tools/store/acceptance.h"

namespace mavoea::tool {
namespace {

// What a program takes of an attribute area.
struct AreaLimits {
    std::uint64_t total_size;  // at most
    std::uint16_t count;       // at most
};
constexpr AreaLimits kSmbdLimits = {65536, 1024};
constexpr AreaLimits kMacLimits = {kStreamSizeMax, kAttributeCountMax};

constexpr std::uint16_t kMacEntries = 15;  // at most
constexpr std::uint32_t kForkOffset = kAttributeHeaderOffset;

std::string Number(std::uint64_t value) { return std::to_string(value); }

std::optional<std::string> WhyNoAttribute(const Layout::Record& record, std::size_t index,
                                          const Layout& file) {
    const std::string name = "its attribute " + Number(index) + ' ';
    if (record.stored_name.size() < 2 || record.stored_name.back() != '\0') {
        return name + "has no name that ends";
    }
    const Range value = record.fixed.value;
    const Range data = file.attributes->data;
    if (value.length > 0 && (value.offset < data.offset || value.end() > data.end())) {
        return name + "has a value outside the values";
    }
    return std::nullopt;
}

std::optional<std::string> WhyNoArea(const Layout& file, const AreaLimits& limits,
                                     std::uint64_t fork_offset) {
    if (!file.attributes) return "its attribute header passes its end";
    const AttributeHeader& header = *file.attributes;
    if (header.magic != kAttributeMagic) {
        return "\"ATTR\" is not at " + Number(kAttributeHeaderOffset + sizeof(header.pad));
    }
    if (header.total_size > fork_offset) {
        return "its attributes end at " + Number(header.total_size) + ", behind the fork's start";
    }
    if (header.total_size > limits.total_size) {
        return "its attributes take " + Number(header.total_size) + " bytes, more than " +
               Number(limits.total_size);
    }
    if (header.data.offset < kStreamHeaderSize) {
        return "its values begin at " + Number(header.data.offset) + ", before " +
               Number(kStreamHeaderSize);
    }
    if (header.data.end() > header.total_size) return "its values pass the attributes' end";
    if (header.count > limits.count) {
        return "it has " + Number(header.count) + " attributes, more than " + Number(limits.count);
    }
    if (file.records.size() < header.count || file.TableEnd() > header.total_size) {
        return "its attribute table passes the attributes' end";
    }
    for (std::size_t i = 0; i < file.records.size(); ++i) {
        if (auto why = WhyNoAttribute(file.records[i], i, file)) return why;
    }
    return std::nullopt;
}

std::optional<std::string> WhyNoAppleDouble(const Layout& file) {
    if (!file.IsAppleDouble() || file.header->version != kAppleDoubleVersion2) {
        return "it is no AppleDouble file of version 2";
    }
    if (file.entries.size() < file.header->entry_count) return "it ends inside its descriptors";
    return std::nullopt;
}

}  // namespace

std::optional<std::string> WhySmbdIgnores(const Layout& file) {
    if (auto why = WhyNoAppleDouble(file)) return why;
    if (file.entries.size() != 2) {
        return "it has " + Number(file.entries.size()) + " entries, not 2";
    }
    const auto info = file.FindEntry(EntryId::kFinderInfo);
    const auto fork = file.FindEntry(EntryId::kResourceFork);
    if (!info || !fork) return "its two entries are not Finder info and resource fork";
    const Range finder_info = file.entries[*info].data;
    if (finder_info.offset != kFinderInfoOffset) {
        return "its Finder info is at " + Number(finder_info.offset) + ", not at " +
               Number(kFinderInfoOffset);
    }
    if (finder_info.length < kFinderInfoSize) {
        return "its Finder info has " + Number(finder_info.length) + " bytes, fewer than " +
               Number(kFinderInfoSize);
    }
    if (finder_info.end() > file.file_size) return "its Finder info passes its end";
    // A fork that passes the end is cut.
    const std::uint32_t fork_offset = file.entries[*fork].data.offset;
    if (fork_offset < kForkOffset) {
        return "its fork is at " + Number(fork_offset) + ", before " + Number(kForkOffset);
    }
    if (fork_offset > file.file_size) return "its fork begins behind its end";
    if (!file.HasAttributeArea()) return std::nullopt;
    return WhyNoArea(file, kSmbdLimits, fork_offset);
}

std::optional<std::string> WhyMacIgnores(const Layout& file) {
    if (auto why = WhyNoAppleDouble(file)) return why;
    const std::size_t count = file.entries.size();
    if (count == 0 || count > kMacEntries) {
        return "it has " + Number(count) + " entries, not 1 to " + Number(kMacEntries);
    }
    const std::size_t head_end = DescriptorsEnd(file.header->entry_count);
    for (std::size_t i = 0; i < count; ++i) {
        const EntryDescriptor& entry = file.entries[i];
        if (entry.data.length == 0) continue;
        const std::string name = "its entry " + Number(i) + " (" + EntryName(entry.id) + ") ";
        if (entry.data.offset < head_end) return name + "begins inside its header";
        if (entry.data.end() > file.file_size && entry.id != EntryId::kResourceFork) {
            return name + "passes its end";
        }
    }
    return file.HasAttributeArea() ? WhyNoArea(file, kMacLimits, file.file_size) : std::nullopt;
}

}  // namespace mavoea::tool

#include "tools/store/encoding.h"

#include <algorithm>

#include "format/ea_stream.h"
#include "format/netatalk_record.h"
#include "tools/store/fitting.h"

namespace mavoea::tool {
namespace {

std::uint32_t ForkLength(const Metadata& metadata) {
    return metadata.fork ? static_cast<std::uint32_t>(metadata.fork->value.size()) : 0;
}

Bytes FinderInfo(const Metadata& metadata) {
    return metadata.finder_info ? metadata.finder_info->value.All() : Bytes(kFinderInfoSize);
}

void AddFork(const Metadata& metadata, Pieces* pieces) {
    if (metadata.fork) pieces->push_back(metadata.fork->value);
}

std::uint8_t NameSize(const Metadata::Attribute& attribute) {
    return static_cast<std::uint8_t>(attribute.name.size() + 1);
}

std::uint64_t TableSize(const Metadata& metadata) {
    std::uint64_t size = 0;
    for (const auto& attribute : metadata.attributes) size += RecordSize(NameSize(attribute));
    return size;
}

std::uint64_t ValuesSize(const Metadata& metadata) {
    std::uint64_t size = 0;
    for (const auto& attribute : metadata.attributes) size += attribute.value.size();
    return size;
}

StreamHeader HeaderFor(const Metadata& metadata) {
    StreamHeader header = NewStreamHeader();
    const Bytes info = FinderInfo(metadata);
    std::copy(info.begin(), info.end(), header.finder_info_bytes.begin());
    header.resource_fork.data.length = ForkLength(metadata);
    return header;
}

// The bytes of entries that a record or head has a place for.
class Entries {
 public:
    explicit Entries(const Metadata& metadata) {
        bytes_[EntryId::kFinderInfo] = FinderInfo(metadata);
        for (const auto& [id, item] : metadata.entries) bytes_[id] = item.value.All();
    }

    ByteView operator()(std::uint32_t id) const {
        const auto found = bytes_.find(static_cast<EntryId>(id));
        return found == bytes_.end() ? ByteView() : ByteView(found->second);
    }

 private:
    std::map<EntryId, Bytes> bytes_;
};

// Whether the "._" file of the source says all that there is to say.
bool IsWhole(const Metadata& metadata) {
    if (!metadata.whole_apple_double) return false;
    const std::string& path = metadata.whole_apple_double->path();
    const auto held = [&](const Metadata::Item& item) { return item.holder == path; };
    return std::all_of(metadata.attributes.begin(), metadata.attributes.end(),
                       [&](const auto& attribute) { return attribute.holder == path; }) &&
           (!metadata.finder_info || held(*metadata.finder_info)) &&
           (!metadata.fork || held(*metadata.fork)) &&
           std::all_of(metadata.entries.begin(), metadata.entries.end(),
                       [&](const auto& entry) { return held(entry.second); });
}

}  // namespace

Pieces EncodeStream(const Metadata& metadata) {
    StreamHeader header = HeaderFor(metadata);
    const auto start = static_cast<std::uint32_t>(kStreamHeaderSize + TableSize(metadata));
    const auto length = static_cast<std::uint32_t>(ValuesSize(metadata));
    header.attributes.count = static_cast<std::uint16_t>(metadata.attributes.size());
    header.attributes.data = {start, length};
    header.attributes.total_size = start + length;
    header.finder_info.data.length = header.attributes.total_size - kFinderInfoOffset;
    header.resource_fork.data.offset = header.attributes.total_size;

    Bytes head(start);
    EncodeStreamHeader(header, std::span(head).first<kStreamHeaderSize>());
    Pieces pieces(1);
    std::size_t at = kStreamHeaderSize;
    std::uint32_t value_at = start;
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        const auto size = static_cast<std::uint32_t>(attribute.value.size());
        const AttributeRecord record = {
            .value = {value_at, size}, .flags = attribute.flags, .name_size = NameSize(attribute)};
        EncodeAttributeRecord(record, attribute.name.c_str(), &head[at]);
        at += RecordSize(record.name_size);
        value_at += size;
        if (size > 0) pieces.push_back(attribute.value);
    }
    pieces.front() = Content(std::move(head));
    AddFork(metadata, &pieces);
    return pieces;
}

Pieces EncodePlain(const Metadata& metadata) {
    Bytes head(kStreamHeaderSize);
    EncodeStreamHeader(HeaderFor(metadata), std::span(head).first<kStreamHeaderSize>());
    head.resize(kAttributeHeaderOffset);
    Pieces pieces = {Content(std::move(head))};
    AddFork(metadata, &pieces);
    return pieces;
}

Pieces EncodeWithHead(const Metadata& metadata) {
    Bytes head(kResourceHeadSize);
    EncodeRecord(kResourceHead, Entries(metadata), ForkLength(metadata), head);
    Pieces pieces = {Content(std::move(head))};
    AddFork(metadata, &pieces);
    return pieces;
}

Pieces EncodeAppleDouble(const Metadata& metadata) {
    if (const WholeFile& whole = metadata.whole_apple_double) {
        return {Content(whole, 0, whole->Size())};
    }
    if (!metadata.attributes.empty()) return EncodeStream(metadata);
    if (!metadata.entries.empty()) return EncodeWithHead(metadata);
    if (metadata.finder_info || metadata.fork) return EncodePlain(metadata);
    return {};
}

Bytes EncodeRecordBlock(const Metadata& metadata) {
    Bytes block(kAttributeBlockSize);
    EncodeRecord(kFreshRecord, Entries(metadata), 0, block);
    return block;
}

std::uint32_t RoomInHead(EntryId id) {
    return RoomFor(kResourceHead, static_cast<std::uint32_t>(id), kResourceHeadSize);
}

std::uint32_t RoomInRecord(EntryId id) {
    return RoomFor(kFreshRecord, static_cast<std::uint32_t>(id), kAttributeBlockSize);
}

void FitStream(Metadata* metadata, std::vector<Missing>* missing) {
    std::uint64_t left = kStreamSizeMax - 1 - kResourceHeadSize;
    if (metadata->fork) {
        if (metadata->fork->value.size() > left) {
            missing->push_back({"resource fork", "with it the file would pass 4 GiB"});
            metadata->fork.reset();
        } else {
            left -= metadata->fork->value.size();
        }
    }
    std::size_t count = 0;
    std::erase_if(metadata->attributes, [&](const Metadata::Attribute& attribute) {
        const auto refuse = [&](const char* why) {
            missing->push_back({NameOfAttribute(attribute.name), why});
            return true;
        };
        if (attribute.name.size() >= kNameSizeMax) {
            return refuse("its name has more than 254 bytes");
        }
        const std::uint64_t size = RecordSize(NameSize(attribute)) + attribute.value.size();
        if (size > left) return refuse("with it the file would pass 4 GiB");
        if (++count > kAttributeCountMax) return refuse("it would be one attribute too many");
        left -= size;
        return false;
    });
}

void FitAppleDouble(Metadata* metadata, std::vector<Missing>* missing) {
    if (IsWhole(*metadata)) return;
    metadata->whole_apple_double.reset();
    DropDamaged(metadata);
    FitStream(metadata, missing);
    if (!metadata->attributes.empty()) {
        FitEntries(
            metadata, [](EntryId) { return std::uint32_t{0}; }, "a \"._\" file with attributes",
            missing);
    }
    FitEntries(metadata, RoomInHead, "a \"._\" file", missing);
}

}  // namespace mavoea::tool

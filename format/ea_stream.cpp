#include "format/ea_stream.h"

namespace mavoea {
namespace {

AttributeHeader ReadAttributeHeader(BeReader& in) {
    AttributeHeader header;
    header.pad = in.U16();
    header.magic = in.U32();
    header.debug_tag = in.U32();
    header.total_size = in.U32();
    header.data.offset = in.U32();
    header.data.length = in.U32();
    in.Copy(header.reserved);
    header.flags = in.U16();
    header.count = in.U16();
    return header;
}

}  // namespace

AttributeHeader NoAttributes() {
    AttributeHeader header;
    header.magic = kAttributeMagic;
    header.data.offset = kStreamHeaderSize;
    return header;
}

StreamHeader NewStreamHeader() {
    StreamHeader header;
    header.file = {
        .magic = kAppleDoubleMagic,
        .version = kAppleDoubleVersion2,
        .filler = {'M', 'a', 'c', ' ', 'O', 'S', ' ', 'X', ' ', ' ', ' ', ' ', ' ', ' ', ' ', ' '},
        .entry_count = 2};
    header.finder_info = {EntryId::kFinderInfo, {kFinderInfoOffset, kFinderInfoSize}};
    header.resource_fork = {EntryId::kResourceFork, {kFinderInfoOffset + kFinderInfoSize, 0}};
    header.attributes = NoAttributes();
    return header;
}

std::array<std::uint8_t, kNewResourceSize> EncodeResourceHead(std::uint32_t fork_length) {
    std::array<std::uint8_t, kNewResourceSize> bytes{};
    BeWriter out(bytes);
    EncodeAppleDoubleHeader(
        {.magic = kAppleDoubleMagic,
         .version = kAppleDoubleVersion2,
         .filler = {'M', 'A', 'V', 'O', 'N', 'I', 'C', 'S', ' ', ' ', ' ', ' ', ' ', ' ', ' ', ' '},
         .entry_count = 2},
        out);
    EncodeEntryDescriptor({EntryId::kFinderInfo, {kFinderInfoOffset, kFinderInfoSize}}, out);
    EncodeEntryDescriptor(
        {EntryId::kResourceFork, {kFinderInfoOffset + kFinderInfoSize, fork_length}}, out);
    return bytes;
}

StreamHeader DecodeStreamHeader(std::span<const std::uint8_t, kStreamHeaderSize> bytes) {
    BeReader in(bytes);
    StreamHeader header;
    header.file = DecodeAppleDoubleHeader(in);
    header.finder_info = DecodeEntryDescriptor(in);
    header.resource_fork = DecodeEntryDescriptor(in);
    in.Copy(header.finder_info_bytes);
    header.attributes = ReadAttributeHeader(in);
    return header;
}

void EncodeStreamHeader(const StreamHeader& header,
                        std::span<std::uint8_t, kStreamHeaderSize> bytes) {
    BeWriter out(bytes);
    EncodeAppleDoubleHeader(header.file, out);
    EncodeEntryDescriptor(header.finder_info, out);
    EncodeEntryDescriptor(header.resource_fork, out);
    out.Copy(header.finder_info_bytes);
    out.U16(header.attributes.pad);
    out.U32(header.attributes.magic);
    out.U32(header.attributes.debug_tag);
    out.U32(header.attributes.total_size);
    out.U32(header.attributes.data.offset);
    out.U32(header.attributes.data.length);
    out.Copy(header.attributes.reserved);
    out.U16(header.attributes.flags);
    out.U16(header.attributes.count);
}

bool DecodeAttributeHeader(ByteView bytes, AttributeHeader* header) {
    BeReader in(bytes);
    *header = ReadAttributeHeader(in);
    return in.ok();
}

}  // namespace mavoea

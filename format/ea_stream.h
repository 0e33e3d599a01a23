// The EA stream: an AppleDouble file of version 2 with the attribute area that Mac OS X writes into
// its "._" files. Four regions, one behind the other: fixed header, table of attributes, their
// values, resource fork. docs/formats.md shows one byte by byte.
#ifndef MAVOEA_FORMAT_EA_STREAM_H_
#define MAVOEA_FORMAT_EA_STREAM_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

#include "format/apple_double.h"

namespace mavoea {

inline constexpr std::size_t kStreamHeaderSize = 120;
inline constexpr std::uint32_t kFinderInfoOffset = 50;
inline constexpr std::uint16_t kStreamDescriptorMax = 13;
inline constexpr std::uint32_t kAttributeMagic = 0x41545452;  // "ATTR"

// Where the pad and the attribute header lie, wherever the Finder info does.
inline constexpr std::size_t kAttributeHeaderOffset = kFinderInfoOffset + kFinderInfoSize;

// A stream's offsets are 32-bit.
inline constexpr std::uint64_t kStreamSizeMax = std::uint64_t{1} << 32;
inline constexpr unsigned kAttributeCountMax = 0xFFFF;
inline constexpr std::size_t kNameSizeMax = 255;  // its NUL included

//   offset  size  field
//       82     2  pad
//       84     4  magic        "ATTR"
//       88     4  debug tag    carried through
//       92     4  total size   where the resource fork begins
//       96     4  data start   where the values begin
//      100     4  data length  of all values together
//      104    12  reserved     carried through
//      116     2  flags        carried through
//      118     2  number of attributes
struct AttributeHeader {
    std::uint16_t pad = 0;
    std::uint32_t magic = 0;
    std::uint32_t debug_tag = 0;
    std::uint32_t total_size = 0;
    Range data;
    std::array<std::uint8_t, 12> reserved{};
    std::uint16_t flags = 0;
    std::uint16_t count = 0;
};

//   offset  size  field
//        0    26  AppleDouble header
//       26    12  Finder info descriptor: from the Finder info to the end of the values, so that
//                 the resource fork begins where this entry ends
//       38    12  resource fork descriptor
//       50    32  Finder info
//       82    38  pad and attribute header
struct StreamHeader {
    AppleDoubleHeader file;
    EntryDescriptor finder_info;
    EntryDescriptor resource_fork;
    std::array<std::uint8_t, kFinderInfoSize> finder_info_bytes{};
    AttributeHeader attributes;
};

// What a stream without attributes, Finder info and fork has.
StreamHeader NewStreamHeader();

// The head of a resource file that is made from attributes: the AppleDouble header, the descriptors
// of Finder info and of a fork of that length, and the places for the Finder info and the fork's
// first two bytes.
inline constexpr std::size_t kNewResourceSize = 84;
std::array<std::uint8_t, kNewResourceSize> EncodeResourceHead(std::uint32_t fork_length);

// The attribute header of an AppleDouble file that has no attribute area.
AttributeHeader NoAttributes();

StreamHeader DecodeStreamHeader(std::span<const std::uint8_t, kStreamHeaderSize> bytes);
void EncodeStreamHeader(const StreamHeader& header,
                        std::span<std::uint8_t, kStreamHeaderSize> bytes);

// The number of attributes alone.
constexpr std::uint16_t DecodeAttributeCount(
    std::span<const std::uint8_t, kStreamHeaderSize> bytes) {
    return LoadBe16(&bytes[118]);
}

// From the bytes at kAttributeHeaderOffset; false when they are too few.
bool DecodeAttributeHeader(ByteView bytes, AttributeHeader* header);
inline constexpr std::size_t kAttributeHeaderSize = kStreamHeaderSize - kAttributeHeaderOffset;

// A record of the attribute table, which is padded with zeros to a multiple of 4 bytes.
//
//   offset  size  field
//        0     4  offset       of the value, from the start of the file; of none when length is 0
//        4     4  length       of the value
//        8     2  flags        carried through
//       10     1  name size    in bytes, its NUL included
//       11     n  name
struct AttributeRecord {
    static constexpr std::size_t kFixedSize = 11;

    Range value;
    std::uint16_t flags = 0;
    std::uint8_t name_size = 0;
};

constexpr std::uint32_t RecordSize(std::uint8_t name_size) { return (name_size + 14U) & ~3U; }
static_assert(RecordSize(1) == 12 && RecordSize(2) == 16 && RecordSize(255) == 268);

// The smallest table that can hold `count` records: names of no bytes, the last one unpadded.
constexpr std::uint64_t SmallestTable(std::uint16_t count) {
    if (count == 0) return 0;
    return (count - std::uint64_t{1}) * RecordSize(0) + AttributeRecord::kFixedSize;
}

// The fixed part of a record; false when the bytes are too few.
constexpr bool DecodeAttributeRecord(ByteView bytes, AttributeRecord* record) {
    BeReader in(bytes);
    record->value.offset = in.U32();
    record->value.length = in.U32();
    record->flags = in.U16();
    record->name_size = in.U8();
    return in.ok();
}

// A whole record, its padding included, into RecordSize(record.name_size) bytes. `name` has
// record.name_size bytes.
inline void EncodeAttributeRecord(const AttributeRecord& record, const char* name,
                                  std::uint8_t* to) {
    StoreBe32(0, to + RecordSize(record.name_size) - 4);  // the padding, or what is written over it
    // As one: of two neighbouring words compilers make one store of eight single bytes.
    constexpr std::uint64_t kHighWord = std::uint64_t{1} << 32;
    StoreBe64(record.value.offset * kHighWord + record.value.length, to);
    StoreBe16(record.flags, to + 8);
    to[10] = record.name_size;
    CopyShort(to + AttributeRecord::kFixedSize, name, record.name_size);
}

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_EA_STREAM_H_

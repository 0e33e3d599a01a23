// EA streams built byte by byte, without the library: what tests fill files with and compare files
// to.
#ifndef MAVOEA_TESTS_SUPPORT_STREAM_BUILDER_H_
#define MAVOEA_TESTS_SUPPORT_STREAM_BUILDER_H_

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "tests/support/temp_dir.h"

namespace mavoea::test {

// Big-endian fields at a place in `bytes`; aborts outside them.
std::uint16_t U16At(std::span<const std::uint8_t> bytes, std::size_t at);
std::uint32_t U32At(std::span<const std::uint8_t> bytes, std::size_t at);
void PutU16(std::span<std::uint8_t> bytes, std::size_t at, std::uint32_t value);
void PutU32(std::span<std::uint8_t> bytes, std::size_t at, std::uint64_t value);

// `count` bytes that differ from place to place and from one seed to the next, with a period that
// divides no block size.
Bytes Pattern(std::size_t count, std::uint8_t seed = 0);

// Where the fields of the 120 bytes in front are.
enum HeaderField : std::uint32_t {
    kDescriptorCountAt = 24,
    kFinderIdAt = 26,
    kFinderOffsetAt = 30,
    kFinderLengthAt = 34,
    kForkIdAt = 38,
    kForkOffsetAt = 42,
    kForkLengthAt = 46,
    kFinderInfoAt = 50,
    kPadAt = 82,
    kAttributeMagicAt = 84,
    kDebugTagAt = 88,
    kTotalSizeAt = 92,
    kDataStartAt = 96,
    kDataLengthAt = 100,
    kReservedAt = 104,
    kFlagsAt = 116,
    kAttributeCountAt = 118,
    kTableAt = 120,
};

// Bytes that a record takes whose name has `name_length` bytes, its NUL included.
std::uint32_t RecordSize(std::size_t name_length);

struct Attribute {
    std::string name;
    Bytes value;
    std::uint16_t flags = 0;

    bool operator==(const Attribute&) const = default;
};

// A whole stream. The defaults are those of a new one.
struct StreamImage {
    std::vector<Attribute> attributes = {};
    Bytes fork = {};
    Bytes finder_info = Repeat(0, 32);

    std::uint32_t magic = 0x00051607;
    std::uint32_t version = 0x00020000;
    Bytes filler = Ascii("Mac OS X        ");
    std::uint16_t descriptor_count = 2;
    bool fork_first = false;  // the resource fork's descriptor before the Finder info's
    std::uint16_t pad = 0;
    Bytes attribute_magic = Ascii("ATTR");
    std::uint32_t debug_tag = 0;
    Bytes reserved = Repeat(0, 12);
    std::uint16_t flags = 0;
    std::uint32_t gap = 0;    // unused bytes between table and data area
    std::uint32_t slack = 0;  // unused bytes between data area and fork, as Macs leave them

    std::uint32_t TableSize() const;
    std::uint32_t DataStart() const { return kTableAt + TableSize() + gap; }
    std::uint32_t DataLength() const;
    std::uint32_t TotalSize() const { return DataStart() + DataLength() + slack; }
    std::size_t End() const { return TotalSize() + fork.size(); }

    // Where record `index` begins, and the offset of its value.
    std::size_t RecordAt(std::size_t index) const;
    std::uint32_t ValueAt(std::size_t index) const;

    Bytes Build() const;
};

// What another system's AppleDouble writer leaves: `count` descriptors (Finder info, fork, then
// some of other ids), the 32 bytes of Finder info right behind them, then the fork.
Bytes PlainAppleDouble(const Bytes& finder_info, const Bytes& fork, unsigned count = 2);

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_STREAM_BUILDER_H_

// AppleDouble: Apple's container for what a file has beside its data. A header, entry descriptors,
// then the entries' data wherever the descriptors say. From Apple's "AppleSingle/AppleDouble
// Formats for Foreign Files"; all integers are big-endian.
#ifndef MAVOEA_FORMAT_APPLE_DOUBLE_H_
#define MAVOEA_FORMAT_APPLE_DOUBLE_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "util/bytes.h"

namespace mavoea {

inline constexpr std::uint32_t kAppleDoubleMagic = 0x00051607;
inline constexpr std::uint32_t kAppleDoubleVersion1 = 0x00010000;
inline constexpr std::uint32_t kAppleDoubleVersion2 = 0x00020000;

// What an entry holds. There are more kinds; streams keep the resource fork and the Finder info.
enum class EntryId : std::uint32_t {
    kNone = 0,
    kResourceFork = 2,
    kComment = 4,
    kFileDates = 8,
    kFinderInfo = 9,
    kAfpFileInfo = 14
};

//   offset  size  field
//        0     4  magic
//        4     4  version
//        8    16  filler            the home file system in version 1, zeros or text since
//       24     2  number of entries
struct AppleDoubleHeader {
    static constexpr std::size_t kSize = 26;

    std::uint32_t magic = 0;
    std::uint32_t version = 0;
    std::array<std::uint8_t, 16> filler{};
    std::uint16_t entry_count = 0;
};

//   offset  size  field
//        0     4  id       what the entry holds, see EntryId
//        4     4  offset   from the start of the file
//        8     4  length   in bytes, may be 0
struct EntryDescriptor {
    static constexpr std::size_t kSize = 12;

    EntryId id = EntryId::kNone;
    Range data;
};

// Finder info has 32 bytes; see finder_info.h.
inline constexpr std::size_t kFinderInfoSize = 32;

// What Macs write where a file that has no resource fork must have one: an empty fork with this
// text in it.
inline constexpr std::string_view kBlankForkText = "This resource fork intentionally left blank   ";
inline constexpr std::size_t kBlankForkTextOffset = 16;
static_assert(kBlankForkText.size() == 46);

// File dates: of creation, modification, backup and access, in seconds from 2000-01-01 UTC, signed.
inline constexpr std::size_t kFileDatesSize = 16;
inline constexpr std::size_t kBackupDateOffset = 8;
inline constexpr std::uint32_t kUnknownDate = 0x80000000;

// AFP file info: 4 bytes, of which the last two are the AFP attributes. From the Apple Filing
// Protocol; the attributes forbid writing, renaming and deleting one by one.
inline constexpr std::size_t kAfpFileInfoSize = 4;
inline constexpr std::size_t kAfpAttributesOffset = 2;
inline constexpr std::uint16_t kAfpInvisible = 0x0001;
inline constexpr std::uint16_t kAfpSystem = 0x0004;
inline constexpr std::uint16_t kAfpNoWrite = 0x0020;
inline constexpr std::uint16_t kAfpBackup = 0x0040;  // it has changed since it was backed up
inline constexpr std::uint16_t kAfpNoRename = 0x0080;
inline constexpr std::uint16_t kAfpNoDelete = 0x0100;

// Who has written a file, in its filler: a Mac, or netatalk and Samba.
inline constexpr std::string_view kMacFiller = "Mac OS X        ";
inline constexpr std::string_view kNetatalkFiller = "Netatalk        ";
static_assert(kMacFiller.size() == sizeof AppleDoubleHeader::filler);
static_assert(kNetatalkFiller.size() == sizeof AppleDoubleHeader::filler);

// Where a header with that many entries and its descriptors end.
constexpr std::size_t DescriptorsEnd(std::uint16_t entry_count) {
    return AppleDoubleHeader::kSize + entry_count * EntryDescriptor::kSize;
}

// Decoding never fails: past the end of the bytes, fields are 0 and the reader's ok() turns false.
constexpr AppleDoubleHeader DecodeAppleDoubleHeader(BeReader& in) {
    AppleDoubleHeader header;
    header.magic = in.U32();
    header.version = in.U32();
    in.Copy(header.filler);
    header.entry_count = in.U16();
    return header;
}

constexpr void EncodeAppleDoubleHeader(const AppleDoubleHeader& header, BeWriter& out) {
    out.U32(header.magic);
    out.U32(header.version);
    out.Copy(header.filler);
    out.U16(header.entry_count);
}

constexpr EntryDescriptor DecodeEntryDescriptor(BeReader& in) {
    EntryDescriptor entry;
    entry.id = static_cast<EntryId>(in.U32());
    entry.data.offset = in.U32();
    entry.data.length = in.U32();
    return entry;
}

constexpr void EncodeEntryDescriptor(const EntryDescriptor& entry, BeWriter& out) {
    out.U32(static_cast<std::uint32_t>(entry.id));
    out.U32(entry.data.offset);
    out.U32(entry.data.length);
}

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_APPLE_DOUBLE_H_

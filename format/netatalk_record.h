// The netatalk metadata record: an AppleDouble header with its entries' data in one small block.
// From netatalk's adouble.h; all integers are big-endian. Kept in a file's extended attribute
// (kAttributeBlockSize bytes) or at the head of its resource file (kResourceHeadSize bytes).
#ifndef MAVOEA_FORMAT_NETATALK_RECORD_H_
#define MAVOEA_FORMAT_NETATALK_RECORD_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

#include "format/apple_double.h"

namespace mavoea {

// The extended attribute that holds a record on file-EA volumes.
inline constexpr char kNetatalkAttribute[] = "user.netatalk.Metadata";

inline constexpr std::size_t kRecordDataSize = 1024;
inline constexpr std::size_t kAttributeBlockSize = 402;
inline constexpr std::size_t kResourceHeadSize = 741;

// Entries have slots: the standard ids are their own, netatalk's four private ids follow.
inline constexpr std::size_t kSlotCount = 20;
enum class Slot : std::uint32_t {
    kNone = 0,
    kResourceFork = 2,
    kComment = 4,
    kFileDates = 8,
    kFinderInfo = 9,
    kAfpFileInfo = 14,
    kPrivateDevice = 16,
    kPrivateInode = 17,
    kPrivateSync = 18,
    kPrivateId = 19,
};

// The layout of a fresh record, and how slots and on-disk ids map to each other.
struct RecordEntry {
    Slot slot;
    std::uint32_t id;
    Range data;  // in a fresh record
};
inline constexpr std::array<RecordEntry, 8> kFreshRecord = {{
    {Slot::kComment, 4, {154, 0}},
    {Slot::kFileDates, 8, {354, 16}},
    {Slot::kFinderInfo, 9, {122, 32}},
    {Slot::kAfpFileInfo, 14, {370, 4}},
    {Slot::kPrivateDevice, 0x80444556, {374, 0}},
    {Slot::kPrivateInode, 0x80494E4F, {382, 0}},
    {Slot::kPrivateSync, 0x8053594E, {390, 0}},
    {Slot::kPrivateId, 0x8053567E, {398, 0}},
}};
static_assert(DescriptorsEnd(kFreshRecord.size()) == 122);

// The head of a resource file that holds more than Finder info and a resource fork: netatalk's
// classic layout, with the fork behind it.
inline constexpr std::array<RecordEntry, 13> kResourceHead = {{
    {Slot{3}, 3, {182, 0}},  // real name
    {Slot::kComment, 4, {437, 0}},
    {Slot::kFileDates, 8, {637, 16}},
    {Slot::kFinderInfo, 9, {653, 32}},
    {Slot{15}, 15, {685, 4}},  // AFP directory id
    {Slot::kAfpFileInfo, 14, {689, 4}},
    {Slot{13}, 13, {693, 0}},  // AFP short name
    {Slot{11}, 11, {705, 8}},  // ProDOS file info
    {Slot::kPrivateDevice, 0x80444556, {713, 0}},
    {Slot::kPrivateInode, 0x80494E4F, {721, 0}},
    {Slot::kPrivateSync, 0x8053594E, {729, 0}},
    {Slot::kPrivateId, 0x8053567E, {737, 0}},
    {Slot::kResourceFork, 2, {kResourceHeadSize, 0}},
}};
static_assert(DescriptorsEnd(kResourceHead.size()) == 182);

// How many bytes an entry can have in a block of that layout; 0 where it has no place.
template <std::size_t kCount>
constexpr std::uint32_t RoomFor(const std::array<RecordEntry, kCount>& layout, std::uint32_t id,
                                std::size_t block_size) {
    for (std::size_t i = 0; i < kCount; ++i) {
        if (layout[i].id != id) continue;
        const std::size_t end = i + 1 < kCount ? layout[i + 1].data.offset : block_size;
        // The Finder info of a fresh record stands before the comment, which comes first.
        if (end > layout[i].data.offset) {
            return static_cast<std::uint32_t>(end) - layout[i].data.offset;
        }
        return layout[i].data.length;
    }
    return 0;
}
static_assert(RoomFor(kResourceHead, 4, kResourceHeadSize) == 200);
static_assert(RoomFor(kResourceHead, 13, kResourceHeadSize) == 12);
static_assert(RoomFor(kFreshRecord, 4, kAttributeBlockSize) == 200);
static_assert(RoomFor(kFreshRecord, 8, kAttributeBlockSize) == 16);

// Fills a block of that layout, which is all zeros. `bytes_of` gives an entry's bytes by its id,
// none for what a fresh record has; they fit. The fork itself lies behind the block.
template <std::size_t kCount, class BytesOf>
constexpr void EncodeRecord(const std::array<RecordEntry, kCount>& layout, BytesOf bytes_of,
                            std::uint32_t fork_length, ByteSpan block) {
    BeWriter out(block);
    EncodeAppleDoubleHeader({.magic = kAppleDoubleMagic,
                             .version = kAppleDoubleVersion2,
                             .filler = {},
                             .entry_count = static_cast<std::uint16_t>(kCount)},
                            out);
    for (const RecordEntry& entry : layout) {
        const ByteView bytes = bytes_of(entry.id);
        Range data = entry.data;
        if (entry.slot == Slot::kResourceFork) {
            data.length = fork_length;
        } else if (!bytes.empty()) {
            data.length = static_cast<std::uint32_t>(bytes.size());
        }
        EncodeEntryDescriptor({static_cast<EntryId>(entry.id), data}, out);
        BeWriter(block.subspan(entry.data.offset)).Copy(bytes);
    }
}

// The slot of an on-disk id; kNone for an id that has none.
constexpr Slot SlotOf(std::uint32_t id) {
    if (id <= 15) return static_cast<Slot>(id);
    for (const RecordEntry& entry : kFreshRecord) {
        if (entry.id == id) return entry.slot;
    }
    return Slot::kNone;
}

static_assert(SlotOf(9) == Slot::kFinderInfo && SlotOf(0x8053567E) == Slot::kPrivateId);
static_assert(SlotOf(16) == Slot::kNone && SlotOf(0x80000000) == Slot::kNone);

// Whether an entry may stand in a record. Only the resource fork's data may run past the block.
constexpr bool AcceptableEntry(Slot slot, Range data) {
    return slot != Slot::kNone && data.offset < kRecordDataSize &&
           (slot == Slot::kResourceFork || data.end() <= kRecordDataSize);
}

// A fresh record with that Finder info, ready to be stored.
std::array<std::uint8_t, kAttributeBlockSize> EncodeFreshRecord(
    std::span<const std::uint8_t, kFinderInfoSize> finder_info);

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_NETATALK_RECORD_H_

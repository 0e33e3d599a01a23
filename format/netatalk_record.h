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

// What the netatalk-record units offer each other and the operations; none of it is exported.
#ifndef MAVOEA_ADOUBLE_INTERNAL_H_
#define MAVOEA_ADOUBLE_INTERNAL_H_

#include <cstddef>
#include <span>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "util/volume_kind.h"

namespace mavoea {

// The first `size` bytes of a record's entry; none when the entry is absent or shorter, or does not
// lie in the record's data whole, behind its descriptors.
inline std::span<std::uint8_t> EntryBytes(EAAdouble& record, Slot slot, std::size_t size) {
    const EAAdoubleEntry& entry = record.entries[static_cast<std::size_t>(slot)];
    BeReader in(record.data);
    const auto first =
        static_cast<std::int64_t>(DescriptorsEnd(DecodeAppleDoubleHeader(in).entry_count));
    if (entry.offset < first || entry.length < size) return {};
    if (entry.offset > static_cast<std::int64_t>(sizeof record.data - size)) return {};
    return {record.data + entry.offset, size};
}

// Whether the platform says that path is on a file-EA volume.
inline bool OnFileEAVolume(const char* path) {
    return VolumeKindOf(MAVOGetFSType(path, 1)) == VolumeKind::kFileEA;
}

// Finder info from the object's netatalk record into its resource file; nothing without a record,
// or when that has none: the resource file's is not cleared. 0 or -1: 0xD00 NULL; otherwise with
// the codes of the functions that it calls.
int EAFileEAFSFinfoFileSync(const char* path);

// The 32 bytes of Finder info in the object's netatalk record; finfo is left alone when the record
// has none. 0, 1 (no record), or -1: 0xD00 NULL, or as MAVOEAFileEAAdoubleRead().
int EAFileEAFSFinfoRead(const char* path, unsigned char finfo[32]);

// Replaces the object's netatalk record by a fresh one with that Finder info: whatever else it held
// is reset. 0, or -1: 0xD00 NULL, or as MAVOEAFileEAAdoubleFlush().
int EAFileEAFSFinfoFlush(const char* path, const unsigned char finfo[32]);

}  // namespace mavoea

#endif  // MAVOEA_ADOUBLE_INTERNAL_H_

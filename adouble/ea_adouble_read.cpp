// Parses a netatalk metadata block into a record.

#include <string.h>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "util/bytes.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_adouble_read");

int RejectEntry(Slot slot, Range data, int line = __builtin_LINE()) {
    unit.LogAt(line, "%s:%d AdoubleEntriesParse: wrong eid: %u, off: %u, len: %u",
               static_cast<unsigned>(slot), data.offset, data.length);
    return unit.Fail(Err::kBadArgument, line);
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAAdoubleRead(const void* buf, int len, EAAdouble* ad) {
    if (buf == nullptr || ad == nullptr || len < 0 ||
        static_cast<std::size_t>(len) > sizeof ad->data) {
        return unit.Fail(Err::kBadArgument);
    }
    memcpy(ad->data, buf, static_cast<std::size_t>(len));

    // Bounds are those of the data field, whatever len: what lies behind the block is the caller's
    // zeros.
    BeReader in(ad->data);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    ad->magic = header.magic;
    ad->version = header.version;
    if (header.magic != kAppleDoubleMagic || header.version != kAppleDoubleVersion2) {
        unit.Log("%s:%d ad magic[%i] and ad version[%i] error", static_cast<int>(header.magic),
                 static_cast<int>(header.version));
        return unit.Fail(Err::kRead);
    }
    for (unsigned i = 0; i < header.entry_count; ++i) {
        // Past the data all fields are 0, and so is the id, which is rejected.
        const EntryDescriptor entry = DecodeEntryDescriptor(in);
        const Slot slot = SlotOf(static_cast<std::uint32_t>(entry.id));
        // Stored before it is checked.
        ad->entries[static_cast<std::size_t>(slot)] = {.offset = entry.data.offset,
                                                       .length = entry.data.length};
        if (!AcceptableEntry(slot, entry.data)) return RejectEntry(slot, entry.data);
    }
    return 0;
}

#include "tools/store/foreign/record.h"

#include <algorithm>

#include "format/netatalk_record.h"
#include "tools/say/messages.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/layout.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {
namespace {

// smbd removes a record that it cannot parse, as the superuser.
bool SmbdTakes(const Layout& layout, std::size_t size) {
    if (size != kAttributeBlockSize || !layout.IsAppleDouble() ||
        layout.header->version != kAppleDoubleVersion2 ||
        layout.entries.size() != kFreshRecord.size()) {
        return false;
    }
    for (const RecordEntry& known : kFreshRecord) {
        const auto id = static_cast<EntryId>(known.id);
        const auto index = layout.FindEntry(id);
        if (!index) return false;
        const Range data = layout.entries[*index].data;
        const std::uint32_t room = id == EntryId::kFinderInfo
                                       ? std::uint32_t{kFinderInfoSize}
                                       : RoomFor(kFreshRecord, known.id, kAttributeBlockSize);
        const bool whole = data.length == 0 || id == EntryId::kComment || data.length == room;
        if (data.offset == 0 || data.length > room || !whole || data.end() > size) return false;
    }
    return true;
}

}  // namespace

ForeignRecord ForeignRecord::Read(const Inode& object) {
    ForeignRecord record;
    const auto block = object.Attribute(kRecordAttribute);
    if (!block) return record;
    const Layout layout = ReadLayout(ByteView(*block));
    if (!SmbdTakes(layout, block->size())) {
        throw Failure(kFailed, object.path(), "its netatalk record is damaged",
                      "look at it with: mavoea dump --record PATH");
    }
    record.there_ = true;
    for (const EntryDescriptor& entry : layout.entries) {
        const ByteView bytes = ByteView(*block).subspan(entry.data.offset, entry.data.length);
        record.entries_[entry.id] = Bytes(bytes.begin(), bytes.end());
    }
    return record;
}

const Bytes& ForeignRecord::Entry(EntryId id) const {
    static const Bytes none;
    const auto found = entries_.find(id);
    return found == entries_.end() ? none : found->second;
}

void ForeignRecord::Set(EntryId id, Bytes bytes) { entries_[id] = std::move(bytes); }

bool ForeignRecord::SaysAnything() const {
    return std::any_of(entries_.begin(), entries_.end(), [](const auto& entry) {
        const auto& [id, bytes] = entry;
        if (SlotOf(static_cast<std::uint32_t>(id)) >= Slot::kPrivateDevice) return false;
        return id == EntryId::kAfpFileInfo ? !IsAllZero(bytes) : SaysSomething(id, bytes);
    });
}

// Dates that are not known have no length for Samba, which takes an unknown time of creation for
// one in 2068, and are unknown ones for netatalk.
Bytes ForeignRecord::Encode(const Dialect& dialect) const {
    auto layout = kFreshRecord;
    Bytes dates = Entry(EntryId::kFileDates);
    if (dates.empty() && dialect.marks == Dialect::Marks::kDosAttributes) {
        for (RecordEntry& entry : layout) {
            if (static_cast<EntryId>(entry.id) == EntryId::kFileDates) entry.data.length = 0;
        }
    } else if (dates.empty()) {
        dates.resize(kFileDatesSize);
        for (std::size_t at = 0; at < dates.size(); at += sizeof kUnknownDate) {
            StoreBe32(kUnknownDate, &dates[at]);
        }
    }
    Bytes block(kAttributeBlockSize);
    const auto bytes_of = [&](std::uint32_t id) -> ByteView {
        return static_cast<EntryId>(id) == EntryId::kFileDates ? dates
                                                               : Entry(static_cast<EntryId>(id));
    };
    EncodeRecord(layout, bytes_of, 0, block);
    return block;
}

void ForeignRecord::Store(const Inode& object, const Dialect& dialect) const {
    if (!there_ && !SaysAnything()) return;
    const Bytes block = Encode(dialect);
    if (!SmbdTakes(ReadLayout(ByteView(block)), block.size())) {
        throw Failure(kFailed, object.path(), "its netatalk record would be damaged",
                      "nothing has been written");
    }
    mavoea::tool::Store(object, {kRecordAttribute, Spelling::Datum::kRecord}, block);
}

}  // namespace mavoea::tool

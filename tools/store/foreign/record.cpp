#include "tools/store/foreign/record.h"

#include <algorithm>
#include <utility>

#include "format/netatalk_record.h"
#include "tools/say/messages.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// Private entries may be missing or whole; a comment of any length that has room.
std::optional<std::string> WhySmbdRefuses(const Layout& record) {
    const auto number = [](std::uint64_t value) { return std::to_string(value); };
    if (record.file_size != kAttributeBlockSize) {
        return "it has " + number(record.file_size) + " bytes, not " + number(kAttributeBlockSize);
    }
    if (!record.IsAppleDouble() || record.header->version != kAppleDoubleVersion2) {
        return "it is no AppleDouble block of version 2";
    }
    if (record.entries.size() != kFreshRecord.size() ||
        record.header->entry_count != kFreshRecord.size()) {
        return "it declares " + number(record.header->entry_count) + " entries, not " +
               number(kFreshRecord.size());
    }
    for (const RecordEntry& known : kFreshRecord) {
        const auto id = static_cast<EntryId>(known.id);
        const auto index = record.FindEntry(id);
        if (!index) return std::string("it has no ") + EntryName(id) + " entry";
        const Range data = record.entries[*index].data;
        const std::string name = std::string("its ") + EntryName(id) + " entry ";
        if (data.offset == 0) return name + "has no offset";
        if (data.end() > record.file_size) return name + "passes its end";
        if (data.length == 0) continue;
        if (id == EntryId::kFinderInfo) {
            if (data.length < kFinderInfoSize) return name + "is too short";
            continue;
        }
        const std::uint32_t room = RoomFor(kFreshRecord, known.id, kAttributeBlockSize);
        const bool fits = id == EntryId::kComment ? data.length <= room : data.length == room;
        if (!fits) return name + "has " + number(data.length) + " bytes, not " + number(room);
    }
    return std::nullopt;
}

namespace {

// The seconds of records, from 2000-01-01.
std::uint32_t DateOf(std::int64_t unix_seconds) {
    constexpr std::int64_t kEpoch = 946684800;
    const std::int64_t seconds = unix_seconds - kEpoch;
    return std::in_range<std::int32_t>(seconds) ? static_cast<std::uint32_t>(seconds)
                                                : kUnknownDate;
}

// When it was made. Where nobody has said Samba answers with the oldest time of the file, which a
// copy may not have yet: none of the other dates was before.
std::uint32_t CreationDateOf(const Inode& object, std::optional<std::uint64_t> created,
                             const Bytes& dates) {
    if (!created) {
        const auto dos = DosAttributesOf(object);
        if (dos) created = dos->creation_time;
    }
    if (created) {
        constexpr std::uint64_t kSecond = 10'000'000;
        constexpr std::int64_t kBefore1970 = 11'644'473'600;
        return DateOf(static_cast<std::int64_t>(*created / kSecond) - kBefore1970);
    }
    const struct stat info = object.Status();
    auto oldest = static_cast<std::int32_t>(
        DateOf(std::min({info.st_mtim.tv_sec, info.st_atim.tv_sec, info.st_ctim.tv_sec})));
    for (std::size_t at = 0; at < dates.size(); at += sizeof kUnknownDate) {
        const std::uint32_t date = LoadBe32(&dates[at]);
        if (date != kUnknownDate) oldest = std::min(oldest, static_cast<std::int32_t>(date));
    }
    return static_cast<std::uint32_t>(oldest);
}

// Samba takes an unknown time of creation for one in 2068. Where nothing is known new dates have no
// length; where any is, that one is said.
Bytes DatesForSamba(Bytes dates, const Inode& object, std::optional<std::uint64_t> created) {
    if (!SaysSomething(EntryId::kFileDates, dates)) return dates;
    if (LoadBe32(dates.data()) == kUnknownDate) {
        StoreBe32(CreationDateOf(object, created, dates), dates.data());
    }
    return dates;
}

// For netatalk they are unknown ones.
Bytes DatesForNetatalk(Bytes dates) {
    if (!dates.empty()) return dates;
    dates.resize(kFileDatesSize);
    for (std::size_t at = 0; at < dates.size(); at += sizeof kUnknownDate) {
        StoreBe32(kUnknownDate, &dates[at]);
    }
    return dates;
}

}  // namespace

ForeignRecord ForeignRecord::Read(const Inode& object) {
    ForeignRecord record;
    const auto block = object.Attribute(kRecordAttribute);
    if (!block) return record;
    const Layout layout = ReadLayout(ByteView(*block));
    const auto info = layout.FindEntry(EntryId::kFinderInfo);
    if (WhySmbdRefuses(layout) || layout.entries[*info].data.length > kFinderInfoSize) {
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

Bytes ForeignRecord::Encode(const Bytes& dates) const {
    auto layout = kFreshRecord;
    for (RecordEntry& entry : layout) {
        const bool is_dates = static_cast<EntryId>(entry.id) == EntryId::kFileDates;
        if (is_dates && dates.empty()) entry.data.length = 0;
    }
    Bytes block(kAttributeBlockSize);
    const auto bytes_of = [&](std::uint32_t id) -> ByteView {
        return static_cast<EntryId>(id) == EntryId::kFileDates ? dates
                                                               : Entry(static_cast<EntryId>(id));
    };
    EncodeRecord(layout, bytes_of, 0, block);
    return block;
}

void ForeignRecord::Store(const Inode& object, const Dialect& dialect,
                          std::optional<std::uint64_t> created) const {
    if (!there_ && !SaysAnything()) return;
    const Bytes& dates = Entry(EntryId::kFileDates);
    const Bytes block = Encode(dialect.marks == Dialect::Marks::kDosAttributes
                                   ? DatesForSamba(dates, object, created)
                                   : DatesForNetatalk(dates));
    if (WhySmbdRefuses(ReadLayout(ByteView(block)))) {
        throw Failure(kFailed, object.path(), "its netatalk record would be damaged",
                      "nothing has been written");
    }
    mavoea::tool::Store(object, {kRecordAttribute, Spelling::Datum::kRecord}, block);
}

}  // namespace mavoea::tool

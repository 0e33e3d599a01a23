#include "tools/store/saved.h"

#include <algorithm>
#include <charconv>
#include <utility>

#include "format/ea_stream.h"
#include "format/flush_time.h"
#include "format/netatalk_record.h"
#include "format/samba_stream.h"
#include "include/mavoea.h"
#include "platform/attribute_word.h"
#include "platform/dos_attributes.h"
#include "platform/include/mavocore.h"
#include "tools/place/volume.h"
#include "tools/say/text.h"
#include "tools/store/apple_double_reader.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/foreign/reader.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/gathering.h"
#include "tools/store/marks.h"

namespace mavoea::tool {
namespace {

// ---- Names --------------------------------------------------------------------------------------

constexpr std::string_view kUser = "user.";
// What begins so is none of the user's.
constexpr std::string_view kOwn = "user.mavoea.";

constexpr std::string_view kComment = "comment";
constexpr std::string_view kDates = "dates";
constexpr std::string_view kAfpInfo = "afpinfo";
constexpr std::string_view kLocked = "locked";
constexpr std::string_view kHidden = "hidden";
constexpr std::string_view kSystem = "system";
constexpr std::string_view kArchive = "archive";
constexpr std::string_view kCreated = "created";
constexpr std::string_view kEntry = "entry.";          // and its number
constexpr std::string_view kAttribute = "attribute.";  // and its name, as the next two
constexpr std::string_view kFlags = "flags.";
constexpr std::string_view kService = "service.";

struct NamedEntry {
    EntryId id;
    std::string_view name;
    std::size_t size;  // 0: any
};
constexpr NamedEntry kNamedEntries[] = {{EntryId::kComment, kComment, 0},
                                        {EntryId::kFileDates, kDates, kFileDatesSize},
                                        {EntryId::kAfpFileInfo, kAfpInfo, kAfpFileInfoSize}};

std::string OwnName(std::string_view what, const std::string& of = {}) {
    return std::string(kOwn) + std::string(what) + of;
}

std::string NameOfSavedEntry(EntryId id) {
    for (const NamedEntry& entry : kNamedEntries) {
        if (entry.id == id) return OwnName(entry.name);
    }
    return OwnName(kEntry, std::to_string(static_cast<std::uint32_t>(id)));
}

// Whether "user.NAME" is read as the attribute NAME.
bool MeansItself(const std::string& name) {
    const std::string attribute = std::string(kUser) + name;
    return !attribute.starts_with(kOwn) && !IsOfRecord(attribute) && !IsMark(attribute) &&
           SpellAttribute(name, AnyDialect()).has_value();
}

Content TextContent(const std::string& text) { return Content(Bytes(text.begin(), text.end())); }

// A number in decimal digits, and nothing else.
template <class Number>
std::optional<Number> NumberIn(std::string_view text) {
    Number number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
    return number;
}

// ---- Files of other services --------------------------------------------------------------------

// A name that somebody may have forged leads nowhere else, and is none of the object's own files.
bool IsServiceName(const std::string& name) {
    constexpr std::size_t kNameMost = 255;
    if (name == "._") return true;
    if (name.starts_with('@')) {
        return name.size() > 1 && name.size() <= kNameMost && name.find('/') == name.npos &&
               name != "@" MAVOEA_KIND_STREAM && name != "@" MAVOEA_KIND_RESOURCE &&
               name != "@" MAVOEA_KIND_RESOURCE "Tmp";
    }
    if (!name.starts_with('/')) return false;
    for (std::size_t at = 0; at != name.npos;) {
        const std::size_t end = name.find('/', at + 1);
        const std::string part =
            name.substr(at + 1, end == name.npos ? std::string::npos : end - at - 1);
        if (part.empty() || part == "." || part == ".." || part.size() > kNameMost ||
            part.starts_with(kOwnPrefix)) {
            return false;
        }
        at = end;
    }
    return true;
}

// ---- Back ---------------------------------------------------------------------------------------

// What this tool has written under names of its own.
class OwnItems {
 public:
    OwnItems(const std::string& path, Metadata* metadata)
        : path_(path), metadata_(*metadata), gathering_(metadata) {}

    void Add(const std::string& attribute, Bytes value) {
        std::string_view what = attribute;
        what.remove_prefix(kOwn.size());
        const auto begins = [&](std::string_view prefix) {
            if (!what.starts_with(prefix)) return false;
            what.remove_prefix(prefix.size());
            return true;
        };
        if (begins(kAttribute)) return AddAttribute(attribute, std::string(what), std::move(value));
        if (begins(kFlags)) return AddFlags(attribute, std::string(what), value);
        if (begins(kService)) return AddService(attribute, std::string(what), std::move(value));
        if (begins(kEntry)) {
            const auto number = NumberIn<std::uint32_t>(what);
            const auto id = static_cast<EntryId>(number.value_or(0));
            if (id == EntryId::kNone || id == EntryId::kResourceFork ||
                id == EntryId::kFinderInfo) {
                throw Wrong(attribute, "no entry has that number");
            }
            return AddEntry(attribute, id, std::move(value));
        }
        for (const NamedEntry& entry : kNamedEntries) {
            if (entry.name == what) return AddEntry(attribute, entry.id, std::move(value));
        }
        AddState(attribute, what, value);
    }

    // Once all of them have been added.
    void Finish() {
        for (const auto& [name, flags] : flags_) {
            const auto found = std::find_if(
                metadata_.attributes.begin(), metadata_.attributes.end(),
                [&, &wanted = name](const Metadata::Attribute& one) { return one.name == wanted; });
            if (found == metadata_.attributes.end()) {
                metadata_.problems.push_back(
                    Wrong(OwnName(kFlags, name), "the attribute is not there"));
            } else {
                found->flags = flags;
            }
        }
    }

 private:
    Failure Wrong(const std::string& attribute, const std::string& cause) const {
        return {kFailed, path_, NameOfAttribute(attribute) + ": " + cause,
                "see docs/saving.md for what it may be"};
    }

    void AddAttribute(const std::string& attribute, const std::string& name, Bytes value) {
        if (name.empty()) throw Wrong(attribute, "the name is empty");
        gathering_.AddAttribute({name, Content(std::move(value)), 0, path_, attribute});
    }

    void AddFlags(const std::string& attribute, const std::string& name, const Bytes& value) {
        const auto flags = NumberIn<std::uint16_t>(
            std::string_view(reinterpret_cast<const char*>(value.data()), value.size()));
        if (!flags) throw Wrong(attribute, "no number from 0 to 65535");
        flags_[name] = *flags;
    }

    void AddService(const std::string& attribute, const std::string& name, Bytes value) {
        if (!IsServiceName(name)) throw Wrong(attribute, "no service has such a file");
        metadata_.services.push_back({name, Content(std::move(value)), path_});
    }

    void AddEntry(const std::string& attribute, EntryId id, Bytes value) {
        for (const NamedEntry& entry : kNamedEntries) {
            if (entry.id != id || entry.size == 0 || value.size() == entry.size) continue;
            throw Wrong(attribute, "it has " + std::to_string(entry.size) + " bytes, and not " +
                                       std::to_string(value.size()));
        }
        gathering_.AddEntry(id, Content(std::move(value)), {path_, attribute});
    }

    void AddState(const std::string& attribute, std::string_view what, const Bytes& value) {
        const std::string_view text(reinterpret_cast<const char*>(value.data()), value.size());
        if (what == kCreated) {
            const auto created = NumberIn<std::uint64_t>(text);
            if (!created) throw Wrong(attribute, "no number of 100 ns since 1601");
            metadata_.created = *created;
            return;
        }
        bool* const mark = what == kLocked    ? &metadata_.locked
                           : what == kHidden  ? &metadata_.hidden
                           : what == kSystem  ? &metadata_.system
                           : what == kArchive ? &metadata_.archived
                                              : nullptr;
        if (mark == nullptr) throw Wrong(attribute, "no version that is known gives such a name");
        if (text != "1") throw Wrong(attribute, "it is 1 where the object has the mark");
        *mark = true;
    }

    const std::string path_;
    Metadata& metadata_;
    Gathering gathering_;
    std::map<std::string, std::uint16_t> flags_;
};

// What hosts, and other volumes of this system, keep in attributes of an object.
void AddHostAttributes(SavedAttributes* attributes, Metadata* metadata) {
    if (const auto word = attributes->Take(attribute_word::kName)) {
        const unsigned marks =
            attribute_word::Decode(word->data(), static_cast<ssize_t>(word->size()));
        metadata->locked = metadata->locked || (marks & MLIBC_ATTRIBUTE_LOCKED) != 0;
        metadata->hidden = metadata->hidden || (marks & MLIBC_ATTRIBUTE_HIDDEN) != 0;
        metadata->archived = metadata->archived || (marks & MLIBC_ATTRIBUTE_ARCHIVE) != 0;
    }
    (void)attributes->Take(kFlushTimeAttribute);
    const auto record = attributes->Take(kNetatalkAttribute);
    if (!record) return;
    Noting(metadata, [&] {
        ReadRecord(*record, {attributes->path(), kNetatalkAttribute}, metadata);
    });
    if ((metadata->AfpAttributes().value_or(0) & kAfpLocking) != 0) metadata->locked = true;
}

// Whether Samba's clients honour that they say locked, too.
LockedBy LockedByIn(int type) {
    const Dialect* const dialect = DialectOf(type);
    const bool by_dos =
        type < 0 || (dialect != nullptr && dialect->marks == Dialect::Marks::kDosAttributes);
    return by_dos ? LockedBy::kDosAttributes : LockedBy::kOthers;
}

void AddDosAttributes(SavedAttributes* attributes, int type, Metadata* metadata) {
    if (!attributes->Attribute(kDosAttributesName)) return;
    if (const auto dos = DosAttributesOf(*attributes)) {
        TakeDosAttributes(*dos, LockedByIn(type), metadata);
    } else {
        metadata->problems.emplace_back(
            kFailed, attributes->path(),
            NameOfAttribute(kDosAttributesName) + ": nothing that Samba understands",
            "look at the object that it was made of");
    }
    (void)attributes->Take(kDosAttributesName);
}

// Of a volume of plain extended attributes names are what they are, "user." and all.
void AddPlainAttributes(const SavedAttributes& attributes, ReadBack* read) {
    Gathering gathering(&read->metadata);
    for (const std::string& name : attributes.AttributeNames()) {
        if (!name.starts_with(kUser) && KindOf(name) == Kind::kAttribute) {
            read->others.push_back(name);
            continue;
        }
        Content value(attributes.Attribute(name).value_or(Bytes()));
        if (KindOf(name) == Kind::kFinderInfo && value.size() == kFinderInfoSize) {
            gathering.AddFinderInfo(std::move(value), {attributes.path(), name});
        } else {
            gathering.AddAttribute({name, std::move(value), 0, attributes.path(), name});
        }
    }
}

}  // namespace

// ---- There --------------------------------------------------------------------------------------

std::vector<SavedItem> SavedItems(const Metadata& metadata, std::vector<Missing>* missing) {
    std::vector<SavedItem> items;
    std::uint64_t total = 0;
    const auto add = [&](const std::string& item, const std::string& attribute, Content value) {
        if (value.damaged()) return missing->push_back({item, "it is damaged: " + value.problem()});
        if (value.size() > kSavedValueMax || value.size() > kSavedObjectMax - total) {
            return missing->push_back({item, "it is larger than what a text can hold"});
        }
        total += value.size();
        items.push_back({item, attribute, std::move(value)});
    };
    const auto add_mark = [&](bool is_set, const char* item, std::string_view name) {
        if (is_set) add(item, OwnName(name), TextContent("1"));
    };
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        const std::string& name = attribute.name;
        const std::string item = NameOfAttribute(name);
        add(item, MeansItself(name) ? std::string(kUser) + name : OwnName(kAttribute, name),
            attribute.value);
        if (attribute.flags == 0) continue;
        add("flags of " + item, OwnName(kFlags, name),
            TextContent(std::to_string(attribute.flags)));
    }
    if (const auto& info = metadata.finder_info) {
        add("Finder info", std::string(kUser) + std::string(kFinderInfoName), info->value);
    }
    if (const auto& fork = metadata.fork) {
        add("resource fork", std::string(kUser) + std::string(kResourceForkName), fork->value);
    }
    for (const auto& [id, item] : metadata.entries) {
        if (item.value.damaged()) {
            add(NameOfEntry(id), NameOfSavedEntry(id), item.value);
            continue;
        }
        Bytes bytes = WithoutLock(id, item.value.All());
        if (SaysSomething(id, bytes)) {
            add(NameOfEntry(id), NameOfSavedEntry(id), Content(std::move(bytes)));
        }
    }
    add_mark(metadata.locked, "locked state", kLocked);
    add_mark(metadata.hidden, "hidden mark", kHidden);
    add_mark(metadata.system, "system mark", kSystem);
    add_mark(metadata.archived, "archive mark", kArchive);
    if (metadata.created) {
        add("creation time", OwnName(kCreated), TextContent(std::to_string(*metadata.created)));
    }
    for (const Metadata::ServiceFile& service : metadata.services) {
        const std::string item = NameOfAttribute(service.name) + " of another service";
        if (!IsServiceName(service.name)) {
            missing->push_back({item, "its name could lead elsewhere"});
            continue;
        }
        add(item, OwnName(kService, service.name), service.value);
    }
    for (const Metadata::Stray& stray : metadata.strays) {
        missing->push_back({stray.item, stray.reason});
    }
    return items;
}

// ---- SavedAttributes ----------------------------------------------------------------------------

void SavedAttributes::Set(const std::string& name, Bytes value, TextEncoding encoding) {
    Value& there = values_.try_emplace(name, Value{{}, encoding, next_position_++}).first->second;
    there.bytes = std::move(value);
    there.encoding = encoding;
}

std::vector<std::string> SavedAttributes::AttributeNames() const {
    std::vector<std::pair<std::size_t, std::string>> positions;
    for (const auto& [name, value] : values_) positions.emplace_back(value.position, name);
    std::sort(positions.begin(), positions.end());
    std::vector<std::string> names;
    names.reserve(positions.size());
    for (auto& [position, name] : positions) names.push_back(std::move(name));
    return names;
}

std::optional<Bytes> SavedAttributes::Attribute(const std::string& name) const {
    const auto found = values_.find(name);
    return found == values_.end() ? std::nullopt : std::optional(found->second.bytes);
}

std::optional<Bytes> SavedAttributes::Take(const std::string& name) {
    const auto found = values_.find(name);
    if (found == values_.end()) return std::nullopt;
    Bytes bytes = std::move(found->second.bytes);
    values_.erase(found);
    return bytes;
}

void SavedAttributes::RestoreNuls(const Dialect& dialect) {
    const auto lacks = [&](const std::string& name, const Bytes& bytes) {
        if (name == kNetatalkAttribute || name == kRecordAttribute) {
            return bytes.size() + 1 == kAttributeBlockSize;
        }
        if (name == attribute_word::kName) return bytes.size() + 1 == attribute_word::kSize;
        if (name == kDosAttributesName) {
            Bytes longer = bytes;
            longer.push_back(0);
            return !DecodeDosAttributes(bytes) && DecodeDosAttributes(longer);
        }
        if (name == std::string(kUser) + std::string(kFinderInfoName)) {
            return bytes.size() + 1 == kFinderInfoSize;
        }
        const auto spelling = SpellingOf(name, dialect);
        // The last byte of a stream that goes on says how often, and is none.
        return spelling && spelling->has_nul &&
               !(DecodeStreamAttribute(name) && values_.contains(NameOfExtent(name, 1)));
    };
    for (auto& [name, value] : values_) {
        if (value.encoding == TextEncoding::kText && !name.starts_with(kOwn) &&
            lacks(name, value.bytes)) {
            value.bytes.push_back(0);
        }
    }
}

ReadBack ReadSaved(SavedAttributes attributes, int type) {
    ReadBack read;
    const Dialect& dialect = DialectOf(type) != nullptr ? *DialectOf(type) : AnyDialect();
    attributes.RestoreNuls(dialect);
    std::vector<std::pair<std::string, Bytes>> own;
    for (const std::string& name : attributes.AttributeNames()) {
        if (!name.starts_with(kOwn)) continue;
        Bytes value = *attributes.Take(name);
        // The write bits that a locked file had are there while it is locked.
        if (IsMark(name)) {
            read.metadata.locked = true;
        } else {
            own.emplace_back(name, std::move(value));
        }
    }
    AddDosAttributes(&attributes, type, &read.metadata);
    if (KeepingOf(type) == Keeping::kXattr && DialectOf(type) == nullptr) {
        AddHostAttributes(&attributes, &read.metadata);
        AddPlainAttributes(attributes, &read);
    } else {
        SavedAttributes host(attributes.path());
        for (const char* name : {attribute_word::kName, kFlushTimeAttribute, kNetatalkAttribute}) {
            if (auto value = attributes.Take(name)) {
                host.Set(name, *std::move(value), TextEncoding::kHex);
            }
        }
        AddForeignAttributes(dialect, attributes, attributes.AttributeNames(), Certainty::kAny,
                             &read.metadata);
        // Those of other programs are in the word; a record of this system's has others.
        TakeMarksFromWord(&read.metadata);
        AddHostAttributes(&host, &read.metadata);
        for (const std::string& name : attributes.AttributeNames()) {
            if (!IsForeign(name, dialect)) read.others.push_back(name);
        }
    }
    OwnItems items(attributes.path(), &read.metadata);
    for (auto& [name, value] : own) {
        Noting(&read.metadata,
               [&, &attribute = name, &bytes = value] { items.Add(attribute, std::move(bytes)); });
    }
    items.Finish();
    return read;
}

}  // namespace mavoea::tool

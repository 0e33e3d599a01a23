#include "tools/show/attribute_dump.h"

#include <algorithm>
#include <optional>

#include "format/afp_info.h"
#include "format/samba_stream.h"
#include "platform/dos_attributes.h"
#include "tools/place/directory.h"
#include "tools/say/text.h"
#include "tools/show/dates.h"
#include "tools/show/dump.h"
#include "tools/show/entry_text.h"
#include "tools/show/fields.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/layout.h"
#include "tools/store/marks.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kUser = "user.";

// Of more than so many bytes of a value the first are shown.
constexpr std::size_t kShownMax = 64;

struct Bit {
    std::uint32_t bit;
    const char* name;
};
constexpr Bit kValidFlags[] = {{kDosAttributesValid, "attributes"},
                               {0x02, "EA size"},
                               {0x04, "size"},
                               {0x08, "allocated size"},
                               {kDosCreationTimeValid, "creation time"},
                               {0x20, "change time"},
                               {0x40, "itime"}};
constexpr Bit kDosBits[] = {{kDosReadOnly, "read-only"},
                            {kDosHidden, "hidden"},
                            {kDosSystem, "system"},
                            {0x08, "volume label"},
                            {kDosDirectory, "directory"},
                            {kDosArchive, "archive"},
                            {0x40, "device"},
                            {0x80, "normal"},
                            {0x100, "temporary"},
                            {0x200, "sparse"},
                            {0x400, "reparse point"},
                            {0x800, "compressed"},
                            {0x1000, "offline"},
                            {0x2000, "not indexed"},
                            {0x4000, "encrypted"}};

template <std::size_t kCount>
std::vector<std::string> NamesOf(std::uint32_t word, const Bit (&bits)[kCount]) {
    std::vector<std::string> names;
    for (const Bit& bit : bits) {
        if ((word & bit.bit) != 0) names.emplace_back(bit.name);
        word &= ~bit.bit;
    }
    if (word != 0) names.push_back("unknown " + HexNumber(word));
    return names;
}

std::string WithNames(std::uint32_t word, const std::vector<std::string>& names) {
    std::string text = HexNumber(word);
    const char* separator = ": ";
    for (const std::string& name : names) {
        text += separator + name;
        separator = ", ";
    }
    return text;
}

// Of 100 ns from 1601-01-01 UTC.
std::string NtTimeText(std::uint64_t time) {
    constexpr std::uint64_t kPerSecond = 10000000;
    constexpr std::int64_t kEpoch = 11644473600;
    const std::string number = " (" + std::to_string(time) + ")";
    if (time == 0) return "unknown" + number;
    return DateText(static_cast<std::int64_t>(time / kPerSecond) - kEpoch).value_or("unknown") +
           number;
}

std::string ValueText(ByteView bytes) {
    const ByteView shown = bytes.first(std::min(bytes.size(), kShownMax));
    const std::string text(shown.begin(), shown.end());
    return HexDigits(shown) + (shown.size() < bytes.size() ? "..." : "") + " \"" + Printable(text) +
           "\"";
}

// Of one attribute among others.
class Dumping {
 public:
    Dumping(const Object& object, const Inode& inode, const std::vector<std::string>& names)
        : object_(object), inode_(inode), names_(names) {}

    // None of those that are of no other program and no user.
    std::optional<AttributeDump> Run(const std::string& name, const Bytes& value) {
        if (name == kDosAttributesName) {
            AddDosAttributes(name, value);
        } else if (name == kRecordAttribute) {
            return DumpOfRecord(name, value);
        } else if (name.starts_with("user.DosStream")) {
            AddStream(name, value);
        } else if (name.starts_with(kUser) && !IsMark(name)) {
            AddPlain(name, value);
        } else {
            return std::nullopt;
        }
        fields_.AddFindings(findings_);
        json_.Set("notes", findings_.notes);
        json_.Set("violations", Fields::ViolationsJson(findings_));
        return AttributeDump{fields_.Take(), std::move(json_), findings_.violations.size()};
    }

 private:
    void Begin(const std::string& name, const Bytes& value, const std::string& kind) {
        fields_.Line(Printable(inode_.path()) + ": " + Printable(name) + ", " + kind + ", " +
                     std::to_string(value.size()) + " bytes");
        json_.SetText("file", inode_.path());
        json_.SetText("attribute", name);
        json_.Set("kind", kind);
        json_.Set("size", value.size());
    }
    void Violate(const std::string& what) { findings_.violations.push_back({what}); }
    void AddNote(const std::string& what) { findings_.notes.push_back(what); }

    // ---- Samba's DOS attributes -----------------------------------------------------------------

    void AddDosAttributes(const std::string& name, const Bytes& value) {
        Begin(name, value, "DOS attributes");
        const DosAttributesFields fields = ReadDosAttributesFields(value);
        if (!fields.text.empty()) {
            fields_.Add("text", '"' + Printable(fields.text) + '"');
            json_.SetText("text", fields.text);
        }
        const auto decoded = DecodeDosAttributes(value);
        if (decoded && fields.size == 0) {
            ShowDosAttributes(decoded->attributes);
            return;
        }
        if (fields.version) {
            fields_.Add("version", std::to_string(*fields.version));
            json_.Set("version", *fields.version);
        }
        if (fields.valid_flags) {
            const auto names = NamesOf(*fields.valid_flags, kValidFlags);
            fields_.Add("valid flags", WithNames(*fields.valid_flags, names));
            json_.Set("validFlags", *fields.valid_flags);
            json_.Set("validFlagNames", names);
        }
        if (fields.attributes) ShowDosAttributes(*fields.attributes);
        if (fields.creation_time) {
            fields_.Add("creation time", NtTimeText(*fields.creation_time));
            json_.Set("creationTime", *fields.creation_time);
        }
        CheckDosAttributes(fields, value.size());
    }

    void ShowDosAttributes(std::uint32_t attributes) {
        const auto names = NamesOf(attributes, kDosBits);
        fields_.Add("attributes", WithNames(attributes, names));
        json_.Set("attributes", attributes);
        json_.Set("attributeNames", names);
    }

    void CheckDosAttributes(const DosAttributesFields& fields, std::size_t size) {
        if (!fields.version || !fields.version_again) {
            return Violate("it is no number, and too short for a version: Samba takes it for none");
        }
        if (fields.size == 0) {
            Violate("its version is " + std::to_string(*fields.version) + ", not 1 to 5");
        }
        if (fields.version_again != fields.version) {
            Violate("its version is " + std::to_string(*fields.version) + ", and then " +
                    std::to_string(*fields.version_again));
        }
        if (size < fields.size) {
            Violate("it has " + std::to_string(size) + " bytes, and one of version " +
                    std::to_string(*fields.version) + ' ' + std::to_string(fields.size));
        }
        if (!fields.valid_flags) return;
        if ((*fields.valid_flags & kDosAttributesValid) == 0) {
            AddNote("its flags say that the attributes are not valid");
        }
        const bool valid_time = (*fields.valid_flags & kDosCreationTimeValid) != 0;
        if (valid_time && fields.creation_time == 0) {
            AddNote("its flags say that the creation time is valid, which is 0");
        }
        if (!valid_time && fields.creation_time.value_or(0) != 0) {
            AddNote("its flags say that the creation time is not valid");
        }
    }

    // ---- netatalk's record ----------------------------------------------------------------------

    AttributeDump DumpOfRecord(const std::string& name, const Bytes& value) const {
        const Layout layout = ReadLayout(ByteView(value));
        const Findings findings = CheckRecord(layout, RecordPlace::kAttribute);
        const std::string kind = "netatalk record, attribute " + name;
        Json json = DumpJson(inode_.path(), layout, findings, kind.c_str());
        json.SetText("attribute", name);
        return {DumpText(inode_.path(), layout, findings, kind.c_str()), std::move(json),
                findings.violations.size()};
    }

    // ---- Samba's streams ------------------------------------------------------------------------

    void AddStream(const std::string& name, const Bytes& value) {
        const auto stream = DecodeStreamAttribute(name);
        if (!stream) {
            Begin(name, value, "stream of Samba");
            Violate("its name is that of no stream");
            return;
        }
        const std::string text(stream->name.text());
        if (stream->extent > 0) return AddExtent(name, text, stream->extent, value);
        Begin(name, value,
              text == kAfpInfoStream       ? "Finder info of Samba"
              : text == kAfpResourceStream ? "resource fork of Samba"
                                           : "stream of Samba");
        ShowStream(text);
        const auto decoded = DecodeStreamValue(value);
        if (!decoded) {
            Violate("it has no bytes at all, and Samba cannot open it");
            return;
        }
        fields_.Add("bytes", std::to_string(decoded->bytes.size()));
        json_.Set("bytes", decoded->bytes.size());
        fields_.Add("last byte", HexNumber(value.back(), 2));
        json_.Set("lastByte", value.back());
        const unsigned there = CountExtents(text);
        if (decoded->extents > 0 && there > 0) {
            fields_.Add("extents", std::to_string(decoded->extents));
            json_.Set("extents", decoded->extents);
        }
        CheckExtents(text, decoded->extents, there);
        if (text == kAfpInfoStream) AddAfpInfo(decoded->bytes);
    }

    void ShowStream(const std::string& text) {
        fields_.Add("stream", '"' + Printable(text) + '"');
        json_.SetText("stream", text);
    }

    bool HasExtent(const std::string& text, unsigned number) const {
        return std::any_of(names_.begin(), names_.end(), [&](const std::string& other) {
            const auto stream = DecodeStreamAttribute(other);
            return stream && stream->extent == number && stream->name.text() == text;
        });
    }
    unsigned CountExtents(const std::string& text) const {
        return static_cast<unsigned>(
            std::count_if(names_.begin(), names_.end(), [&](const std::string& other) {
                const auto stream = DecodeStreamAttribute(other);
                return stream && stream->extent > 0 && stream->name.text() == text;
            }));
    }

    void CheckExtents(const std::string& text, unsigned extents, unsigned there) {
        if (extents > 0 && there == 0) {
            return Violate("its last byte is " + HexNumber(extents, 2) +
                           ", and neither a NUL nor the number of values that go on with it");
        }
        for (unsigned number = 1; number <= extents; ++number) {
            if (HasExtent(text, number)) continue;
            Violate("extent " + std::to_string(number) + " of " + std::to_string(extents) +
                    " is missing");
        }
    }

    void AddExtent(const std::string& name, const std::string& text, std::uint32_t number,
                   const Bytes& value) {
        Begin(name, value, "extent of a stream of Samba");
        ShowStream(text);
        fields_.Add("extent", std::to_string(number));
        json_.Set("extent", number);
        unsigned extents = 0;
        for (const std::string& other : names_) {
            const auto stream = DecodeStreamAttribute(other);
            if (!stream || stream->extent != 0 || stream->name.text() != text) continue;
            const auto first = inode_.Attribute(other);
            const auto decoded = first ? DecodeStreamValue(*first) : std::nullopt;
            if (decoded) extents = decoded->extents;
        }
        if (number > extents) Violate("no stream goes on in it");
    }

    void AddAfpInfo(ByteView bytes) {
        if (bytes.size() != kAfpInfoSize) {
            Violate("it has " + std::to_string(bytes.size()) + " bytes before the last, and not " +
                    std::to_string(kAfpInfoSize) + ": Samba removes it");
        }
        const auto fields = ReadAfpInfoFields(bytes);
        if (!fields) return;
        const AfpInfo& info = fields->info;
        fields_.Add("signature", HexNumber(fields->signature));
        fields_.Add("version", HexNumber(fields->version));
        fields_.Add("reserved", HexNumber(fields->reserved));
        fields_.Add("backup time", AfpDateText(info.backup_time));
        fields_.Add("Finder info", HexDigits(info.finder_info));
        fields_.Add("ProDOS info", HexDigits(info.prodos_info));
        fields_.Add("reserved", HexDigits(fields->reserved_at_end));
        json_.Set("signature", fields->signature);
        json_.Set("version", fields->version);
        json_.Set("reserved", fields->reserved);
        json_.Set("backupTime", info.backup_time);
        json_.Set("finderInfo", HexDigits(info.finder_info));
        json_.Set("prodosInfo", HexDigits(info.prodos_info));
        json_.Set("reservedAtEnd", HexDigits(fields->reserved_at_end));
        if (!fields->HasSignature()) Violate("its signature is not \"AFP\" and a NUL");
        if (!fields->HasVersion()) Violate("its version is not 0x00000100");
        if (IsAllZero(info.finder_info)) {
            AddNote("it has no Finder info, and Samba takes it for none");
        }
        if (fields->reserved != 0 || !IsAllZero(fields->reserved_at_end)) {
            AddNote("what is reserved is not zero");
        }
    }

    // ---- Attributes as they are -----------------------------------------------------------------

    void AddPlain(const std::string& name, const Bytes& value) {
        const std::string plain = name.substr(kUser.size());
        const Kind kind = KindOf(plain);
        Begin(name, value,
              kind == Kind::kFinderInfo     ? "Finder info"
              : kind == Kind::kResourceFork ? "resource fork"
                                            : "attribute");
        fields_.Add("name", '"' + Printable(plain) + '"');
        json_.SetText("name", plain);
        fields_.Add("value", ValueText(value));
        json_.Set("value", HexDigits(ByteView(value).first(std::min(value.size(), kShownMax))));
        const Dialect* const dialect = object_.dialect();
        const bool with_nul = dialect != nullptr && dialect->names == Dialect::Names::kPlainWithNul;
        if (plain.empty()) Violate("it has no name behind \"user.\"");
        if (kind == Kind::kFinderInfo && value.size() != kFinderInfoSize) {
            Violate("it has " + std::to_string(value.size()) + " bytes, and not " +
                    std::to_string(kFinderInfoSize));
        }
        if (kind == Kind::kAttribute && with_nul && (value.empty() || value.back() != 0)) {
            Violate("it does not end with the NUL that netatalk puts behind it there");
        }
    }

    const Object& object_;
    const Inode& inode_;
    const std::vector<std::string>& names_;
    Fields fields_;
    Json json_;
    Findings findings_;
};

}  // namespace

std::vector<AttributeDump> DumpAttributes(const Object& object) {
    const auto inode = Inode::Open(object.place);
    if (!inode->HoldsContents()) return {};
    std::vector<std::string> names = inode->AttributeNames();
    std::sort(names.begin(), names.end());
    std::vector<AttributeDump> all;
    for (const std::string& name : names) {
        // One that has gone since is none.
        const auto value = inode->Attribute(name);
        if (!value) continue;
        auto dump = Dumping(object, *inode, names).Run(name, *value);
        if (dump) all.push_back(*std::move(dump));
    }
    return all;
}

}  // namespace mavoea::tool

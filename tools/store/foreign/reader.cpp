#include "tools/store/foreign/reader.h"

#include "format/afp_info.h"
#include "tools/store/apple_double_reader.h"
#include "tools/store/foreign/apple_double.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/gathering.h"

namespace mavoea::tool {
namespace {

using Datum = Spelling::Datum;

// The backup time as the dates of a record have it, which know nothing else then.
Bytes DatesOf(const AfpInfo& info) {
    Bytes dates(kFileDatesSize);
    for (std::size_t at = 0; at < dates.size(); at += sizeof kUnknownDate) {
        StoreBe32(at == kBackupDateOffset ? info.backup_time : kUnknownDate, &dates[at]);
    }
    return dates;
}

class ForeignReader {
 public:
    ForeignReader(const AttributeSource& source, Metadata* metadata)
        : source_(source), metadata_(*metadata), gathering_(metadata) {}

    void Read(const Spelling& spelling) {
        Noting(&metadata_, [&] {
            auto value = spelling.Value(source_);
            if (value) Add(spelling, *std::move(value));
        });
    }

 private:
    void Add(const Spelling& spelling, Bytes value) {
        const Origin origin = {source_.path(), spelling.attribute};
        switch (spelling.datum) {
            case Datum::kRecord:
                return ReadRecord(value, origin, &metadata_);
            case Datum::kAfpInfo:
                return AddAfpInfo(value, origin);
            case Datum::kFinderInfo:
                if (value.size() == kFinderInfoSize) {
                    return gathering_.AddFinderInfo(Content(std::move(value)), origin);
                }
                return gathering_.AddStray(
                    "Finder info", "it has " + std::to_string(value.size()) + " bytes, and not 32",
                    origin);
            case Datum::kFork:
                return gathering_.AddFork(Content(std::move(value)), origin);
            case Datum::kAttribute:
                return gathering_.AddAttribute(
                    {spelling.name, Content(std::move(value)), 0, origin.holder, origin.spelling});
        }
    }

    void AddAfpInfo(const Bytes& value, const Origin& origin) {
        const auto info = DecodeAfpInfo(value);
        if (!info) {
            throw Failure(
                kFailed, origin.holder, "its " + std::string(kAfpInfoStream) + " is damaged",
                "look at it with: getfattr -n " + origin.spelling + " -e hex PATH", Fault::kDamage);
        }
        gathering_.AddFinderInfo(Content(Bytes(info->finder_info.begin(), info->finder_info.end())),
                                 origin);
        if (info->backup_time != kNoBackupTime) {
            gathering_.AddEntry(EntryId::kFileDates, Content(DatesOf(*info)), origin);
        }
    }

    const AttributeSource& source_;
    Metadata& metadata_;
    Gathering gathering_;
};

}  // namespace

Metadata ReadForeign(const Dialect& dialect, const Inode& inode,
                     const std::vector<std::string>& attributes, const Sidecars& sidecars) {
    Metadata metadata;
    const auto& apple_double = sidecars.apple_double;
    // Samba takes over what a Mac has put into the file whenever a client looks.
    const bool macs = apple_double && dialect.marks == Dialect::Marks::kDosAttributes &&
                      apple_double->file && IsMacs(*apple_double->file);
    if (macs) (void)ReadFound(*apple_double, &metadata);
    const std::vector<Spelling> spellings = SpellingsAmong(attributes, dialect);
    ForeignReader reader(inode, &metadata);
    for (const Spelling& spelling : spellings) {
        if (spelling.datum != Datum::kFork) reader.Read(spelling);
    }
    // The fork beside the object is what clients see.
    if (apple_double && !macs) (void)ReadFound(*apple_double, &metadata);
    for (const Spelling& spelling : spellings) {
        if (spelling.datum == Datum::kFork) reader.Read(spelling);
    }
    return metadata;
}

void AddForeignAttributes(const Dialect& dialect, const AttributeSource& source,
                          const std::vector<std::string>& attributes, Certainty certainty,
                          Metadata* metadata) {
    ForeignReader reader(source, metadata);
    for (const Spelling& spelling : SpellingsAmong(attributes, dialect)) {
        if (spelling.certain || certainty == Certainty::kAny) reader.Read(spelling);
    }
}

}  // namespace mavoea::tool

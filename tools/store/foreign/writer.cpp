#include "tools/store/foreign/writer.h"

#include <algorithm>
#include <map>
#include <set>

#include "format/afp_info.h"
#include "format/ea_stream.h"
#include "format/netatalk_record.h"
#include "tools/store/fitting.h"
#include "tools/store/foreign/apple_double.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/foreign/record.h"
#include "tools/store/foreign/spelling.h"

namespace mavoea::tool {
namespace {

using Datum = Spelling::Datum;

bool IsOnlyBackupDate(const Bytes& dates) {
    for (std::size_t at = 0; at < dates.size(); at += sizeof kUnknownDate) {
        if (at != kBackupDateOffset && LoadBe32(&dates[at]) != kUnknownDate) return false;
    }
    return true;
}

class ForeignWriter final : public Writer {
 public:
    explicit ForeignWriter(const Dialect& dialect) : dialect_(dialect) {}

    Metadata Fit(Metadata metadata, const Object& to,
                 std::vector<Missing>* missing) const override {
        metadata.ForgetFiles();
        FitServices(&metadata, missing);
        DropDamaged(&metadata);
        TakeMarksFromWord(&metadata);
        FitAttributes(&metadata, missing);
        FitFork(&metadata, to, missing);
        FitEntries(&metadata, RoomInRecord, "a netatalk record", missing);
        return metadata;
    }

 protected:
    std::vector<Part> PartsOf(const Metadata& fitting) const override {
        if (!fitting.fork || dialect_.fork != Dialect::Fork::kAppleDouble) return {};
        return {{&Sidecars::apple_double, "", EncodeForkFile(fitting.fork->value), nullptr}};
    }

    bool WritesObjectFirst() const override { return true; }

    void WriteToObject(const Inode& inode, const Metadata& fitting,
                       Written* written) const override {
        Attributes(dialect_, inode, written).Write(fitting);
    }

 private:
    // What is written to an object, and what of it that leaves behind.
    class Attributes {
     public:
        Attributes(const Dialect& dialect, const Inode& inode, Written* written)
            : dialect_(dialect), inode_(inode), written_(*written) {}

        void Write(const Metadata& fitting) {
            if (!inode_.HoldsContents() && !fitting.HasAny()) return;
            for (const Metadata::Attribute& attribute : fitting.attributes) {
                names_.insert(attribute.name);
                Put(NameOfAttribute(attribute.name), *SpellAttribute(attribute.name, dialect_),
                    attribute.value);
            }
            WriteFinderInfo(fitting);
            if (fitting.fork && dialect_.fork == Dialect::Fork::kAttribute) {
                Put("resource fork", SpellFork(dialect_), fitting.fork->value);
            }
            WriteRecord(fitting);
            if (inode_.HoldsContents()) RemoveOthers();
        }

     private:
        template <class Work>
        void Noting(const std::string& item, Work work) {
            try {
                work();
            } catch (const Failure& failure) {
                written_.missing.push_back({item, failure.cause()});
            }
        }

        void Put(const std::string& item, const Spelling& spelling, const Content& value) {
            kept_.insert(spelling.attribute);
            Noting(item, [&] { Store(inode_, spelling, value.All()); });
        }

        void WriteFinderInfo(const Metadata& fitting) {
            if (dialect_.finder_info == Dialect::FinderInfo::kRecord) return;
            const Spelling spelling = SpellFinderInfo(dialect_);
            if (dialect_.finder_info == Dialect::FinderInfo::kAttribute) {
                if (fitting.finder_info) Put("Finder info", spelling, fitting.finder_info->value);
                return;
            }
            AfpInfo info;
            if (fitting.finder_info) {
                const Bytes bytes = fitting.finder_info->value.All();
                std::copy(bytes.begin(), bytes.end(), info.finder_info.begin());
            }
            if (const auto dates = fitting.entries.find(EntryId::kFileDates);
                dates != fitting.entries.end() && dates->second.value.size() == kFileDatesSize) {
                info.backup_time = LoadBe32(&dates->second.value.All()[kBackupDateOffset]);
            }
            // Samba takes one without Finder info for none.
            if (!fitting.finder_info) return;
            const auto bytes = EncodeAfpInfo(info);
            Put("Finder info", spelling, Content(Bytes(bytes.begin(), bytes.end())));
        }

        void WriteRecord(const Metadata& fitting) {
            ForeignRecord record;
            const bool in_stream =
                dialect_.finder_info == Dialect::FinderInfo::kStream && fitting.finder_info;
            for (const auto& [id, item] : fitting.entries) {
                Bytes bytes = item.value.All();
                if (in_stream && id == EntryId::kFileDates && IsOnlyBackupDate(bytes)) continue;
                record.Set(id, std::move(bytes));
            }
            if (fitting.finder_info && dialect_.finder_info == Dialect::FinderInfo::kRecord) {
                record.Set(EntryId::kFinderInfo, fitting.finder_info->value.All());
            }
            if (dialect_.marks == Dialect::Marks::kRecord) {
                if (auto word = WordWithMarks(fitting)) {
                    record.Set(EntryId::kAfpFileInfo, *std::move(word));
                }
            }
            if (!record.SaysAnything()) return;
            kept_.insert(kRecordAttribute);
            Noting("netatalk record", [&] { record.Store(inode_, dialect_, fitting.created); });
        }

        // Other spellings of what has been written, and what is not to be there any more. Further
        // attributes of an object that was there are its own.
        void RemoveOthers() {
            Noting("what was there before", [&] {
                for (const Spelling& spelling : SpellingsOf(inode_, dialect_)) {
                    if (kept_.contains(spelling.attribute)) continue;
                    const bool other =
                        spelling.datum == Datum::kAttribute && !names_.contains(spelling.name);
                    if (!other) (void)Drop(inode_, spelling);
                }
            });
        }

        const Dialect& dialect_;
        const Inode& inode_;
        Written& written_;
        std::set<std::string> names_;
        std::set<std::string> kept_;  // attributes of the object
    };

    void FitServices(Metadata* metadata, std::vector<Missing>* missing) const {
        for (const Metadata::ServiceFile& service : metadata->services) {
            missing->push_back({NameOfAttribute(service.name) + " of another service",
                                "volumes of the destination's type keep no such file"});
        }
        metadata->services.clear();
    }

    void FitAttributes(Metadata* metadata, std::vector<Missing>* missing) const {
        std::erase_if(metadata->attributes, [&](Metadata::Attribute& attribute) {
            if (attribute.flags != 0) {
                missing->push_back({"flags of " + NameOfAttribute(attribute.name),
                                    "extended attributes have no place for them"});
                attribute.flags = 0;
            }
            if (SpellAttribute(attribute.name, dialect_)) return false;
            missing->push_back({NameOfAttribute(attribute.name),
                                "its name is too long there, or means something else"});
            return true;
        });
    }

    void FitFork(Metadata* metadata, const Object& to, std::vector<Missing>* missing) const {
        if (!metadata->fork || dialect_.fork != Dialect::Fork::kAppleDouble) return;
        const char* why = nullptr;
        if (AppleDoubleName(to.place.name).empty()) {
            why = "its name is too long for a \"._\" file";
        } else if (metadata->fork->value.size() >= kStreamSizeMax - EncodeForkHead(0).size()) {
            why = "with it the file would pass 4 GiB";
        }
        if (why == nullptr) return;
        missing->push_back({"resource fork", why});
        metadata->fork.reset();
    }

    const Dialect& dialect_;
};

}  // namespace

const Writer& ForeignWriterFor(const Dialect& dialect) {
    static std::map<const Dialect*, ForeignWriter> writers;
    return writers.try_emplace(&dialect, dialect).first->second;
}

}  // namespace mavoea::tool

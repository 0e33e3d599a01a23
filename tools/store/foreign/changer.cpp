#include "tools/store/foreign/changer.h"

#include <algorithm>
#include <initializer_list>

#include "format/afp_info.h"
#include "tools/store/apple_double_file.h"
#include "tools/store/foreign/apple_double.h"
#include "tools/store/foreign/record.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/sidecars.h"
#include "tools/store/stream_file.h"

namespace mavoea::tool {
namespace {

using Datum = Spelling::Datum;

class ForeignChanger final : public Changer {
 public:
    ForeignChanger(const Object& object, const Dialect& dialect)
        : object_(object), dialect_(dialect), inode_(Inode::Open(object.place)) {
        if (inode_->HoldsContents()) return;
        throw Failure(kFailed, object.path(), "only files and directories have attributes",
                      "name what it leads to, if it is a symbolic link");
    }

    void Set(const std::string& name, const Bytes& value) override {
        switch (KindOf(name)) {
            case Kind::kAttribute:
            case Kind::kLocked:
                return SetAttribute(name, value);
            case Kind::kFinderInfo:
                CheckFinderInfoSize(object_.path(), value);
                if (IsAllZero(value)) {
                    (void)Remove(name);
                } else {
                    SetFinderInfo(value);
                }
                return;
            case Kind::kResourceFork:
                if (value.empty()) {
                    (void)Remove(name);
                } else {
                    SetFork(value);
                }
                return;
        }
    }

    bool Remove(const std::string& name) override {
        switch (KindOf(name)) {
            case Kind::kAttribute:
            case Kind::kLocked: {
                const bool removed = RemoveSpellings({Datum::kAttribute}, name);
                return RemoveFromFile(name) || removed;
            }
            case Kind::kFinderInfo:
                return RemoveFinderInfo();
            case Kind::kResourceFork:
                break;
        }
        const bool removed = RemoveSpellings({Datum::kFork}, {});
        return RemoveFork() || removed;
    }

 private:
    void SetAttribute(const std::string& name, const Bytes& value) {
        const auto spelling = SpellAttribute(name, dialect_);
        if (!spelling) {
            throw Failure(kFailed, object_.path(),
                          NameOfAttribute(name) +
                              " is too long a name there, or means something "
                              "else to " +
                              std::string(dialect_.program),
                          "give it another name");
        }
        Store(*inode_, *spelling, value);
        (void)RemoveSpellings({Datum::kAttribute}, name, spelling->attribute);
        // From there it would be taken over what has just been stored.
        (void)RemoveFromFile(name);
    }

    void SetFinderInfo(const Bytes& value) {
        if (SpellFinderInfo(dialect_).datum != Datum::kAfpInfo) KeepBackupTime();
        if (dialect_.finder_info == Dialect::FinderInfo::kRecord) {
            ForeignRecord record = ForeignRecord::Read(*inode_);
            record.Set(EntryId::kFinderInfo, value);
            record.Store(*inode_, dialect_);
            (void)RemoveSpellings({Datum::kAfpInfo, Datum::kFinderInfo}, {});
        } else {
            const Spelling spelling = SpellFinderInfo(dialect_);
            if (spelling.datum == Datum::kAfpInfo) {
                StoreAfpInfo(spelling, value);
            } else {
                Store(*inode_, spelling, value);
                (void)RemoveSpellings({Datum::kAfpInfo}, {});
            }
            ClearRecord();
        }
        // What a Mac has left beside the object comes first for Samba.
        SetFinderInfoOfFile(value);
    }

    // The backup time that is there stays.
    void StoreAfpInfo(const Spelling& spelling, const Bytes& finder_info) const {
        const auto there = spelling.Value(*inode_);
        AfpInfo info = (there ? DecodeAfpInfo(*there) : std::nullopt).value_or(AfpInfo());
        std::copy(finder_info.begin(), finder_info.end(), info.finder_info.begin());
        const auto bytes = EncodeAfpInfo(info);
        Store(*inode_, spelling, Bytes(bytes.begin(), bytes.end()));
    }

    // A stream that is to go has the backup time as well, which is no part of the Finder info: the
    // record takes it, if it has none.
    void KeepBackupTime() const {
        for (const Spelling& spelling : SpellingsOf(*inode_, dialect_)) {
            if (spelling.datum != Datum::kAfpInfo) continue;
            const auto value = spelling.Value(*inode_);
            const auto info = value ? DecodeAfpInfo(*value) : std::nullopt;
            if (!info || info->backup_time == kNoBackupTime) continue;
            ForeignRecord record = ForeignRecord::Read(*inode_);
            Bytes dates = record.Entry(EntryId::kFileDates);
            for (std::size_t at = dates.size(); at < kFileDatesSize; at += sizeof kUnknownDate) {
                dates.resize(at + sizeof kUnknownDate);
                StoreBe32(kUnknownDate, &dates[at]);
            }
            if (LoadBe32(&dates[kBackupDateOffset]) != kUnknownDate) return;
            StoreBe32(info->backup_time, &dates[kBackupDateOffset]);
            record.Set(EntryId::kFileDates, std::move(dates));
            record.Store(*inode_, dialect_);
        }
    }

    bool RemoveFinderInfo() {
        KeepBackupTime();
        bool removed = RemoveSpellings({Datum::kAfpInfo, Datum::kFinderInfo}, {});
        removed |= ClearRecord();
        removed |= SetFinderInfoOfFile(Bytes(kFinderInfoSize));
        return removed;
    }

    bool ClearRecord() const {
        ForeignRecord record = ForeignRecord::Read(*inode_);
        if (IsAllZero(record.Entry(EntryId::kFinderInfo))) return false;
        record.Set(EntryId::kFinderInfo, Bytes(kFinderInfoSize));
        record.Store(*inode_, dialect_);
        return true;
    }

    void SetFork(const Bytes& value) {
        // Samba looks for it there, too, if it is told to.
        const bool in_attribute = dialect_.fork == Dialect::Fork::kAttribute ||
                                  (dialect_.names == Dialect::Names::kStream &&
                                   inode_->Attribute(SpellFork(dialect_).attribute).has_value());
        if (in_attribute) {
            Store(*inode_, SpellFork(dialect_), value);
            (void)RemoveSpellings({Datum::kFork}, {}, SpellFork(dialect_).attribute);
            (void)RemoveFork();
            return;
        }
        ChangedFile* const file = OpenFile(true);
        if (file->file().Size() == 0) file->file().Write(0, EncodeForkHead(0));
        AppleDoubleFile(*file).SetFork(value);
        file->Commit();
        (void)RemoveSpellings({Datum::kFork}, {});
    }

    bool RemoveFork() {
        const ChangedFile* const opened = OpenFile(false);
        if (!opened) return false;
        AppleDoubleFile file(*opened);
        if (file.ForkLength() == 0) return false;
        inode_->Sync();
        file.SetFork({});
        return true;
    }

    bool SetFinderInfoOfFile(const Bytes& value) {
        const ChangedFile* const opened = OpenFile(false);
        if (!opened) return false;
        AppleDoubleFile file(*opened);
        if (!file.HasFinderInfo()) return false;
        file.SetFinderInfo(value);
        return true;
    }

    bool RemoveFromFile(const std::string& name) {
        const ChangedFile* const opened = OpenFile(false);
        if (!opened) return false;
        inode_->Sync();
        return StreamFile(*opened).Remove(name);
    }

    // The "._" file, if there is one or it is to be made. It stays open for what is changed next.
    ChangedFile* OpenFile(bool make) {
        if (file_ && file_->HoldAgain()) return file_.get();
        file_.reset();  // which lets go of all locks of that file
        const Place& place = object_.place;
        const std::string name = AppleDoubleName(place.name);
        if (object_.keeping() == Keeping::kAppleDouble && !name.empty()) {
            file_ = ChangedFile::Open(place, {place.directory, name}, make);
            return file_.get();
        }
        if (!make) return nullptr;
        throw Failure(kFailed, object_.path(), "its name is too long for a \"._\" file",
                      "use a shorter name");
    }

    // All but one. Those of one name, where they are attributes.
    bool RemoveSpellings(std::initializer_list<Datum> data, const std::string& name,
                         const std::string& but = {}) const {
        bool removed = false;
        for (const Spelling& spelling : SpellingsOf(*inode_, dialect_)) {
            const bool is_it = std::find(data.begin(), data.end(), spelling.datum) != data.end() &&
                               (spelling.datum != Datum::kAttribute || spelling.name == name);
            if (is_it && spelling.attribute != but) removed |= Drop(*inode_, spelling);
        }
        return removed;
    }

    const Object object_;
    const Dialect& dialect_;
    std::shared_ptr<const Inode> inode_;
    std::unique_ptr<ChangedFile> file_;
};

}  // namespace

std::unique_ptr<Changer> OpenForeignChanger(const Object& object, const Dialect& dialect) {
    return std::make_unique<ForeignChanger>(object, dialect);
}

}  // namespace mavoea::tool

// Volumes that keep metadata in files beside the object: one "._" file, or the EA stream and the
// resource file in the EA directory. File-EA volumes have the Finder info in the object's netatalk
// record too, and there first.

#include <algorithm>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "tools/apple_double_file.h"
#include "tools/messages.h"
#include "tools/record.h"
#include "tools/store.h"
#include "tools/stream_file.h"
#include "util/volume_kind.h"

namespace mavoea::tool {
namespace {

bool IsAllZero(const Bytes& bytes) {
    return std::all_of(bytes.begin(), bytes.end(), [](auto byte) { return byte == 0; });
}

class EaFileStore final : public Store {
 public:
    explicit EaFileStore(const Object& object)
        : has_record_(VolumeKindOf(object.type) == VolumeKind::kFileEA) {
        const int place =
            object.keeping() == Keeping::kAppleDouble ? EA_PLACE_APPLEDOUBLE : EA_PLACE_EADIR;
        stream_ = {object.path, MAVOEA_KIND_STREAM, place};
        if (place == EA_PLACE_EADIR) {
            holders_.push_back({object.path, MAVOEA_KIND_RESOURCE, place});
        }
        holders_.push_back(stream_);
    }

    std::vector<Attribute> List() override {
        std::vector<Attribute> list;
        if (const auto stream = StreamFile::Open(stream_, Access::kRead)) {
            for (const auto& [name, size] : stream->List()) {
                list.push_back({name, size, Kind::kAttribute, stream_.Path()});
            }
        }
        bool has_finder_info = false;
        bool has_fork = false;
        if (const auto record = ReadRecord(); record && record->FinderInfo()) {
            has_finder_info = true;
            list.push_back(
                {std::string(kFinderInfoName), kFinderInfoSize, Kind::kFinderInfo, stream_.object});
        }
        for (const Sidecar& holder : holders_) {
            const auto file = AppleDoubleFile::Open(holder, Access::kRead);
            if (!file) continue;
            if (!has_finder_info && file->FinderInfo()) {
                has_finder_info = true;
                list.push_back({std::string(kFinderInfoName), kFinderInfoSize, Kind::kFinderInfo,
                                file->path()});
            }
            if (!has_fork && file->ForkLength() > 0) {
                has_fork = true;
                list.push_back({std::string(kResourceForkName), file->ForkLength(),
                                Kind::kResourceFork, file->path()});
            }
        }
        return list;
    }

    std::optional<Bytes> Get(const std::string& name) override {
        const Kind kind = KindOf(name);
        if (kind == Kind::kAttribute) {
            const auto stream = StreamFile::Open(stream_, Access::kRead);
            return stream ? stream->Get(name) : std::nullopt;
        }
        if (kind == Kind::kFinderInfo) {
            const auto record = ReadRecord();
            if (auto value = record ? record->FinderInfo() : std::nullopt) return value;
        }
        for (const Sidecar& holder : holders_) {
            const auto file = AppleDoubleFile::Open(holder, Access::kRead);
            if (!file) continue;
            auto value = kind == Kind::kFinderInfo ? file->FinderInfo() : file->Fork();
            if (value) return value;
        }
        return std::nullopt;
    }

    void Set(const std::string& name, const Bytes& value) override {
        switch (KindOf(name)) {
            case Kind::kAttribute:
            case Kind::kLocked:
                StreamFile::Open(stream_, Access::kCreate)->Set(name, value);
                return;
            case Kind::kFinderInfo:
                CheckFinderInfoSize(stream_.object, value);
                // Nothing at all means none, also where another file still has some.
                if (IsAllZero(value)) {
                    Remove(name);
                } else {
                    SetFinderInfo(value);
                }
                return;
            case Kind::kResourceFork:
                if (value.empty()) {
                    Remove(name);
                } else {
                    AppleDoubleFile::Open(holders_.front(), Access::kCreate)->SetFork(value);
                }
                return;
        }
    }

    bool Remove(const std::string& name) override {
        const Kind kind = KindOf(name);
        if (kind == Kind::kAttribute) {
            const auto stream = StreamFile::Open(stream_, Access::kWrite);
            return stream && stream->Remove(name);
        }
        bool removed = false;
        std::optional<Record> record;
        if (kind == Kind::kFinderInfo) record = ReadRecord();
        for (const Sidecar& holder : holders_) {
            const auto file = AppleDoubleFile::Open(holder, Access::kWrite);
            if (!file) continue;
            if (kind == Kind::kFinderInfo && file->FinderInfo()) {
                file->ClearFinderInfo();
                removed = true;
            }
            if (kind == Kind::kResourceFork && file->ForkLength() > 0) {
                file->SetFork({});
                removed = true;
            }
        }
        if (record && record->FinderInfo()) {
            record->SetFinderInfo(Bytes(kFinderInfoSize));
            record->Flush();
            removed = true;
        }
        if (removed && kind == Kind::kFinderInfo) Stamp();
        return removed;
    }

 private:
    std::optional<Record> ReadRecord() const {
        if (!has_record_) return std::nullopt;
        return Record::Read(stream_.object, RecordPlace::kAttribute);
    }

    // Into the first holder, then into the record: a record that is there keeps its other entries,
    // one that is missing is made.
    void SetFinderInfo(const Bytes& value) const {
        std::optional<Record> record = ReadRecord();
        if (record) record->SetFinderInfo(value);
        AppleDoubleFile::Open(holders_.front(), Access::kCreate)->SetFinderInfo(value);
        if (record) {
            record->Flush();
            Stamp();
        } else if (has_record_) {
            const ErrorMark mark;
            if (MAVOEAFileEAFSFinfoEASync(stream_.object.c_str(), 0) != 0) {
                throw LibraryFailure(stream_.object, mark.Get());
            }
        }
    }

    // The time at which the metadata of an object on a file-EA volume changed.
    void Stamp() const {
        if (!has_record_) return;
        const ErrorMark mark;
        if (MAVOEAFileEAWriteFlushTime(stream_.object.c_str(), 0) != 0) {
            throw LibraryFailure(stream_.object, mark.Get());
        }
    }

    bool has_record_;
    Sidecar stream_{};
    // Of Finder info and resource fork: the first that has them is believed, and written.
    std::vector<Sidecar> holders_;
};

}  // namespace

std::unique_ptr<Store> MakeEaFileStore(const Object& object) {
    return std::make_unique<EaFileStore>(object);
}

}  // namespace mavoea::tool

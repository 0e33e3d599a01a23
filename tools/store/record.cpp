#include "tools/store/record.h"

#include <fcntl.h>

#include <algorithm>
#include <ctime>

#include "adouble/internal.h"
#include "format/flush_time.h"
#include "tools/say/messages.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/metadata.h"
#include "tools/store/sidecars.h"
#include "util/bytes.h"

namespace mavoea::tool {
namespace {

constexpr const char* kLook = "look at it with: mavoea dump --record PATH";

}  // namespace

std::optional<Record> Record::Read(const Inode& object) {
    const auto block = object.Attribute(kNetatalkAttribute);
    if (!block) return std::nullopt;
    Record record;
    record.path_ = object.path();
    const bool sound =
        block->size() == kAttributeBlockSize &&
        MAVOEAAdoubleRead(block->data(), int{kAttributeBlockSize}, &record.record_) == 0 &&
        LoadBe16(&(*block)[AppleDoubleHeader::kSize - 2]) == kFreshRecord.size();
    const bool whole =
        std::all_of(kFreshRecord.begin(), kFreshRecord.end(), [&](const auto& entry) {
            return record.record_.entries[static_cast<std::size_t>(entry.slot)].offset != 0;
        });
    if (sound && whole) return record;
    throw Failure(kFailed, object.path(), "its netatalk record is damaged", kLook);
}

bool Record::HasFinderInfo() const { return !IsAllZero(Entry(Slot::kFinderInfo, kFinderInfoSize)); }

void Record::SetFinderInfo(const Bytes& value) {
    const ByteSpan bytes = Entry(Slot::kFinderInfo, kFinderInfoSize);
    if (bytes.empty()) {
        throw Failure(kFailed, path_, "its netatalk record has no room for Finder info", kLook);
    }
    std::copy(value.begin(), value.end(), bytes.begin());
}

std::optional<std::uint16_t> Record::AfpAttributes() const {
    const ByteView info = Entry(Slot::kAfpFileInfo, kAfpFileInfoSize);
    if (info.empty()) return std::nullopt;
    return LoadBe16(&info[kAfpAttributesOffset]);
}

void Record::SetAfpAttributes(std::uint16_t word) {
    const ByteSpan info = Entry(Slot::kAfpFileInfo, kAfpFileInfoSize);
    if (!info.empty()) StoreBe16(word, &info[kAfpAttributesOffset]);
}

void Record::Store(const Inode& object) const {
    object.SetAttribute(kNetatalkAttribute, ByteView(record_.data).first(kAttributeBlockSize));
}

ByteSpan Record::Entry(Slot slot, std::size_t size) { return EntryBytes(record_, slot, size); }

ByteView Record::Entry(Slot slot, std::size_t size) const {
    return EntryBytes(const_cast<EAAdouble&>(record_), slot, size);
}

void StoreFreshRecord(const Inode& object, const Bytes& finder_info) {
    const auto block = EncodeFreshRecord(std::span(finder_info).first<kFinderInfoSize>());
    object.SetAttribute(kNetatalkAttribute, block);
}

void StampFlushTime(const Inode& object) {
    object.SetAttribute(kFlushTimeAttribute, EncodeFlushTime(std::time(nullptr)));
}

std::optional<StoredRecord> ReadStoredRecord(const Object& object, RecordPlace place) {
    if (place == RecordPlace::kAttribute) {
        const auto inode = Inode::Open(object.place);
        if (!inode->HoldsContents()) return std::nullopt;
        const bool foreign = object.dialect() != nullptr || !object.declared;
        std::string attribute = kNetatalkAttribute;
        auto block = inode->Attribute(attribute);
        if (!block && foreign) {
            attribute = kRecordAttribute;
            block = inode->Attribute(attribute);
        }
        if (!block) return std::nullopt;
        return StoredRecord{object.path(), attribute, *std::move(block)};
    }
    const DirectoryRef ea_dir = object.place.directory->FindAgain(kEaDirName);
    if (!ea_dir) return std::nullopt;
    const std::string name = NameInEaDirectory(object.place.name) + "@" MAVOEA_KIND_RESOURCE;
    const auto file = ea_dir->FindFile(name, O_RDONLY);
    if (!file) return std::nullopt;
    Bytes block = file->Read(0, kResourceHeadSize);
    if (block.size() < kResourceHeadSize) return std::nullopt;
    return StoredRecord{file->path(), {}, std::move(block)};
}

}  // namespace mavoea::tool

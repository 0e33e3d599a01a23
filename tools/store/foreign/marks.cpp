#include "tools/store/foreign/marks.h"

#include <sys/stat.h>

#include "format/apple_double.h"
#include "tools/store/foreign/record.h"

namespace mavoea::tool {
namespace {

constexpr std::uint16_t kAfpMarks = kAfpLocking | kAfpInvisible | kAfpSystem | kAfpBackup;
constexpr std::uint32_t kDosMarks = kDosReadOnly | kDosHidden | kDosSystem | kDosArchive;

std::uint16_t AfpMarksOf(const Metadata& metadata) {
    return static_cast<std::uint16_t>(
        (metadata.locked ? kAfpLocking : 0) | (metadata.hidden ? kAfpInvisible : 0) |
        (metadata.system ? kAfpSystem : 0) | (metadata.archived ? kAfpBackup : 0));
}

std::uint32_t DosMarksOf(const Metadata& metadata) {
    return (metadata.locked ? kDosReadOnly : 0) | (metadata.hidden ? kDosHidden : 0) |
           (metadata.system ? kDosSystem : 0) | (metadata.archived ? kDosArchive : 0);
}

// In place, where there are any.
void StoreDosAttributes(const Inode& inode, DosAttributes wanted) {
    auto value = inode.Attribute(kDosAttributesName);
    const auto former = value ? DecodeDosAttributes(*value) : std::nullopt;
    const std::uint32_t others = former ? former->attributes & ~kDosMarks
                                        : (S_ISDIR(inode.info().st_mode) ? kDosDirectory : 0);
    wanted.attributes |= others;
    if (!wanted.creation_time && former) wanted.creation_time = former->creation_time;
    if (former && former->attributes == wanted.attributes &&
        former->creation_time == wanted.creation_time) {
        return;
    }
    const bool in_place = former && former->creation_time == wanted.creation_time &&
                          SetDosAttributes(*value, wanted.attributes);
    if (in_place) return inode.SetAttribute(kDosAttributesName, *value);
    inode.SetAttribute(kDosAttributesName, EncodeDosAttributes(wanted));
}

}  // namespace

void TakeMarksFromWord(Metadata* metadata) {
    const auto word = metadata->AfpAttributes();
    if (!word) return;
    metadata->locked = metadata->locked || (*word & kAfpLocking) != 0;
    metadata->hidden = metadata->hidden || (*word & kAfpInvisible) != 0;
    metadata->system = metadata->system || (*word & kAfpSystem) != 0;
    metadata->archived = metadata->archived || (*word & kAfpBackup) != 0;
    Metadata::Item& item = metadata->entries[EntryId::kAfpFileInfo];
    Bytes bytes = WithoutLock(EntryId::kAfpFileInfo, item.value.All());
    std::uint8_t* const at = &bytes[kAfpAttributesOffset];
    StoreBe16(static_cast<std::uint16_t>(LoadBe16(at) & ~kAfpMarks), at);
    if (IsAllZero(bytes)) {
        metadata->entries.erase(EntryId::kAfpFileInfo);
    } else {
        item.value = Content(std::move(bytes));
    }
}

std::optional<Bytes> WordWithMarks(const Metadata& metadata) {
    const std::uint16_t marks = AfpMarksOf(metadata);
    const auto entry = metadata.entries.find(EntryId::kAfpFileInfo);
    if ((marks & ~kAfpBackup) == 0 && entry == metadata.entries.end()) return std::nullopt;
    Bytes bytes =
        entry == metadata.entries.end() ? Bytes(kAfpFileInfoSize) : entry->second.value.All();
    if (bytes.size() < kAfpFileInfoSize) return bytes;
    std::uint8_t* const at = &bytes[kAfpAttributesOffset];
    StoreBe16(static_cast<std::uint16_t>(LoadBe16(at) | marks), at);
    return bytes;
}

std::optional<DosAttributes> DosAttributesOf(const AttributeSource& source) {
    const auto value = source.Attribute(kDosAttributesName);
    return value ? DecodeDosAttributes(*value) : std::nullopt;
}

void TakeDosAttributes(const DosAttributes& dos, LockedBy locked_by, Metadata* metadata) {
    metadata->created = dos.creation_time;
    metadata->system = metadata->system || (dos.attributes & kDosSystem) != 0;
    metadata->hidden = metadata->hidden || (dos.attributes & kDosHidden) != 0;
    metadata->archived = (dos.attributes & kDosArchive) != 0;
    if (locked_by == LockedBy::kDosAttributes) {
        metadata->locked = metadata->locked || (dos.attributes & kDosReadOnly) != 0;
    }
}

void WriteDosAttributes(const Inode& inode, Into into, const Metadata& metadata) {
    const std::uint32_t marks = DosMarksOf(metadata);
    const bool needed = metadata.created || metadata.system;
    const bool any = into == Into::kAny && ((marks & ~kDosArchive) != 0 || DosAttributesOf(inode));
    if (needed || any) {
        StoreDosAttributes(inode, {.attributes = marks, .creation_time = metadata.created});
    }
}

void SetForeignLock(const Dialect& dialect, const Inode& inode, bool locked) {
    if (dialect.marks == Dialect::Marks::kDosAttributes) {
        DosAttributes wanted = DosAttributesOf(inode).value_or(DosAttributes());
        const bool was = (wanted.attributes & kDosReadOnly) != 0;
        wanted.attributes =
            locked ? wanted.attributes | kDosReadOnly : wanted.attributes & ~kDosReadOnly;
        if (was != locked) StoreDosAttributes(inode, wanted);
    }
    // For others than netatalk's clients the word need not say so, but it must not keep the lock.
    if (locked && dialect.marks != Dialect::Marks::kRecord) return;
    ForeignRecord record = ForeignRecord::Read(inode);
    Bytes info = record.Entry(EntryId::kAfpFileInfo);
    info.resize(kAfpFileInfoSize);
    std::uint8_t* const at = &info[kAfpAttributesOffset];
    const std::uint16_t word = LoadBe16(at);
    const auto wanted =
        static_cast<std::uint16_t>(locked ? word | kAfpLocking : word & ~kAfpLocking);
    if (wanted == word) return;
    StoreBe16(wanted, at);
    record.Set(EntryId::kAfpFileInfo, std::move(info));
    record.Store(inode, dialect);
}

}  // namespace mavoea::tool

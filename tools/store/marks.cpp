#include "tools/store/marks.h"

#include <algorithm>
#include <cerrno>
#include <string>
#include <vector>

#include "adouble/ea_copy_lock.h"
#include "format/flush_time.h"
#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "platform/attribute_word.h"
#include "platform/dos_attributes.h"
#include "platform/file_status.h"
#include "platform/kernel.h"
#include "platform/marks.h"
#include "tools/place/dry_run.h"
#include "tools/say/messages.h"
#include "tools/store/foreign/marks.h"

namespace mavoea::tool {
namespace {

// The write bits that a locked file had, as text: "0220".
constexpr const char* kFormerBits = "user.mavoea.writable";

bool LockedByRecord(const Metadata& metadata) {
    return (metadata.AfpAttributes().value_or(0) & kAfpLocking) != 0;
}

std::optional<mode_t> FormerBits(const Inode& inode) {
    const auto value = inode.Attribute(kFormerBits);
    if (!value || value->size() != 4) return std::nullopt;
    mode_t bits = 0;
    for (const std::uint8_t digit : *value) {
        if (digit < '0' || digit > '7') return std::nullopt;
        bits = bits << 3 | static_cast<mode_t>(digit - '0');
    }
    return bits & kWriteBits;
}

// `listed`: whether the object has the attribute in which hosts keep it; `dos`: its DOS attributes.
std::uint32_t AttributeWordOf(const Inode& inode, bool listed,
                              const std::optional<DosAttributes>& dos) {
#if MAVOEA_HOST_PLATFORM
    // As the host's own function finds it, which takes a path and looks whether there are any.
    const auto bytes = listed ? inode.Attribute(attribute_word::kName) : std::nullopt;
    const std::uint32_t word =
        bytes ? attribute_word::Decode(bytes->data(), static_cast<ssize_t>(bytes->size())) : 0;
    return dos ? attribute_word::WithDos(word, dos->attributes) : word;
#else
    (void)listed;
    (void)dos;
    FileStatus status;
    if (!ReadFileStatus(inode.ProcPath().c_str(), &status)) {
        throw SystemFailure(inode.path(), errno);
    }
    return status.attributes;
#endif
}

}  // namespace

void ReadMarks(const Object& object, const Inode& inode, const std::vector<std::string>& names,
               Metadata* metadata) {
    if (!inode.HoldsContents()) return;
    const Dialect* const dialect = object.dialect();
    const bool by_dos =
        dialect != nullptr ? dialect->marks == Dialect::Marks::kDosAttributes : !object.declared;
    const auto has = [&](const char* name) {
        return std::find(names.begin(), names.end(), name) != names.end();
    };
    const auto dos = has(kDosAttributesName) ? DosAttributesOf(inode) : std::nullopt;
    if (dos) {
        TakeDosAttributes(*dos, by_dos ? LockedBy::kDosAttributes : LockedBy::kOthers, metadata);
    }
    if (dialect != nullptr) TakeMarksFromWord(metadata);
    if (dialect != nullptr && dialect->marks != Dialect::Marks::kHost) return;
    const std::uint32_t word = AttributeWordOf(inode, has(attribute_word::kName), dos);
    metadata->hidden = metadata->hidden || (word & MLIBC_ATTRIBUTE_HIDDEN) != 0;
    metadata->archived = (word & MLIBC_ATTRIBUTE_ARCHIVE) != 0;
    const bool locked = LocksByMode(object)
                            ? (inode.Status().st_mode & kWriteBits) == 0
                            : (word & MLIBC_ATTRIBUTE_LOCKED) != 0 || LockedByRecord(*metadata);
    metadata->locked = metadata->locked || locked;
}

bool TakesMarks(const Inode& inode) {
    return WhyNoAttribute(inode, attribute_word::kName, sizeof(std::uint32_t)) == 0;
}

void SetLockFlag(const Inode& inode, bool locked) {
    if (DryRun()) return;
    (void)EASetLockFlag(inode.ProcPath().c_str(), locked ? 1 : 0);
}

void SetHidden(const Inode& inode, bool hidden) {
    if (DryRun()) return;
    (void)kernel::FileCommand(inode.ProcPath().c_str(),
                              hidden ? marks::kSetHidden : marks::kClearHidden);
}

void SetArchived(const Inode& inode) {
    if (DryRun()) return;
    if (inode.fd() >= 0) {
        (void)kernel::SetArchiveBit(inode.fd());
    } else {
        (void)EASetSmbArchive(inode.ProcPath().c_str());
    }
}

void LockMode(const Inode& inode, mode_t mode) {
    const mode_t bits = mode & kWriteBits;
    if (bits != 0) {
        const std::uint8_t text[] = {'0', static_cast<std::uint8_t>('0' + (bits >> 6 & 7)),
                                     static_cast<std::uint8_t>('0' + (bits >> 3 & 7)),
                                     static_cast<std::uint8_t>('0' + (bits & 7))};
        try {
            inode.SetAttribute(kFormerBits, text);
        } catch (const Failure&) {
            // Without such attributes the owner's is what comes back.
        }
    }
    inode.SetMode(mode & ~kWriteBits);
}

void UnlockMode(const Inode& inode) {
    const mode_t wanted = UnlockedMode(inode);
    if (wanted != (inode.Status().st_mode & kPermissionBits)) inode.SetMode(wanted);
    (void)inode.RemoveAttribute(kFormerBits);
}

bool RemembersMode(const Inode& inode) { return FormerBits(inode).has_value(); }

mode_t UnlockedMode(const Inode& inode) {
    const mode_t mode = inode.Status().st_mode & kPermissionBits;
    if ((mode & kWriteBits) != 0) return mode;
    return mode | FormerBits(inode).value_or(S_IWUSR);
}

bool IsOfRecord(std::string_view attribute) {
    return attribute == kNetatalkAttribute || attribute == kFlushTimeAttribute;
}

bool IsMark(std::string_view attribute) {
    return attribute == attribute_word::kName || attribute == kFormerBits;
}

}  // namespace mavoea::tool

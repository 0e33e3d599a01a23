// The marks of an object: locked, hidden, archive. All of them are kept with the object itself, but
// for what a netatalk record says of the lock.
#ifndef MAVOEA_TOOLS_STORE_MARKS_H_
#define MAVOEA_TOOLS_STORE_MARKS_H_

#include "tools/place/volume.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// Volumes that keep the lock in the permissions: an object is locked that nobody may write.
inline bool LocksByMode(const Object& object) {
    if (const Dialect* const dialect = object.dialect()) {
        return dialect->marks == Dialect::Marks::kHost;
    }
    return object.keeping() == Keeping::kAppleDouble || object.keeping() == Keeping::kXattr;
}

inline constexpr mode_t kWriteBits = 0222;
inline constexpr mode_t kPermissionBits = 07777;

// Reads all three into *metadata. What records say is in its AFP word already; `names`: those of
// the object's attributes. Throws Failure.
void ReadMarks(const Object& object, const Inode& inode, const std::vector<std::string>& names,
               Metadata* metadata);

// The platform's own locked flag. Setting it where the file system has no place for it does
// nothing.
void SetLockFlag(const Inode& inode, bool locked);
// Whether it has one, as far as that is known before.
bool TakesMarks(const Inode& inode);

void SetHidden(const Inode& inode, bool hidden);
void SetArchived(const Inode& inode);

// Gives it that mode without the write bits, and remembers on the file which they were, if the file
// system lets it.
void LockMode(const Inode& inode, mode_t mode);
// Gives back those that are remembered, or else the owner's.
void UnlockMode(const Inode& inode);
bool RemembersMode(const Inode& inode);
// The mode that unlocking would give.
mode_t UnlockedMode(const Inode& inode);

// Whether an attribute of the object itself is a mark, which is carried for what it says and not as
// an attribute; or, on file-EA volumes, a record or its time.
bool IsOfRecord(std::string_view attribute);
bool IsMark(std::string_view attribute);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_MARKS_H_

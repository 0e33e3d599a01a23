// The marks of an object where other programs keep them: Samba's DOS attributes, and the AFP word
// of netatalk's record.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_MARKS_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_MARKS_H_

#include <cstdint>
#include <optional>

#include "platform/dos_attributes.h"
#include "tools/place/dialect.h"
#include "tools/place/directory.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// What the AFP word says is a mark, and no part of the word that travels.
void TakeMarksFromWord(Metadata* metadata);
// The word with them; none where there is nothing to say. That a file is to be backed up goes
// without saying.
std::optional<Bytes> WordWithMarks(const Metadata& metadata);

// Who says whether an object is locked, where its DOS attributes do not: all else is in them
// wherever the object is.
enum class LockedBy { kDosAttributes, kOthers };

// None where the object has none that Samba understands.
std::optional<DosAttributes> DosAttributesOf(const AttributeSource& source);
void TakeDosAttributes(const DosAttributes& dos, LockedBy locked_by, Metadata* metadata);

// Puts marks and creation time into the DOS attributes; `into`: also where there are none, and
// nothing is to be said that has no other place. Throws Failure.
enum class Into { kAny, kNeeded };
void WriteDosAttributes(const Inode& inode, Into into, const Metadata& metadata);

// Sets what clients honour. Throws Failure.
void SetForeignLock(const Dialect& dialect, const Inode& inode, bool locked);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_MARKS_H_

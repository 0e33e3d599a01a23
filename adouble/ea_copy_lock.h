// The Mac locked state of an object, on each kind of volume, for the copy operations and the tool.
#ifndef MAVOEA_ADOUBLE_EA_COPY_LOCK_H_
#define MAVOEA_ADOUBLE_EA_COPY_LOCK_H_

#include "include/mavoea.h"

namespace mavoea {

// Getters: 1 locked, 0 not, -1. Setters: 0 or -1; `lock` 1 locks, anything else unlocks.
using LockGetter = int (*)(const char* path);
using LockSetter = int (*)(const char* path, int lock);

// Volumes that keep the state in the object's write permissions.
int EAModeLockGet(const char* path);
int EAModeLockSet(const char* path, int lock);

// The platform's own flag of a file. Setting it always gives 0 but for a bad argument (0xD00).
int EAPlatformLockGet(const char* path);
int EASetLockFlag(const char* path, int lock);

// The AFP attributes of the object's netatalk record, as `read` finds it.
int EAAdoubleLockGet(const char* path, int (*read)(const char* path, EAAdouble* ad));

// Volumes that keep the state in the platform's flag and the netatalk record.
int EAEADirFSLockGet(const char* path);
int EAEADirFSLockSet(const char* path, int lock);
int EAFileEAFSLockGet(const char* path);
int EAFileEAFSLockSet(const char* path, int lock);

// Gives szDst the state that `getter` finds at szSrc. 0 or -1.
int EACopyLockState(const char* szSrc, const char* szDst, LockGetter getter, LockSetter setter);

// How volumes of a type keep the state; null where they keep none.
LockGetter LockGetterFor(int srcFSType);
LockSetter LockSetterFor(int srcFSType, int dstFSType);

// Carries the Mac locked state over. A type of -1 is asked of the platform (for the destination, of
// its parent directory). 0, also when there is nothing to carry; -2 for a source type that keeps
// none; -1, logged.
int MAVOEACopyLock(const char* szSrc, const char* szDst, int srcFSType, int dstFSType);

}  // namespace mavoea

#endif  // MAVOEA_ADOUBLE_EA_COPY_LOCK_H_

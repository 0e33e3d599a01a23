// The Mac locked state of an object, wherever its volume keeps it.
#ifndef MAVOEA_TOOLS_LOCK_H_
#define MAVOEA_TOOLS_LOCK_H_

#include "tools/volume.h"

namespace mavoea::tool {

// All three throw Failure for volumes that keep no such state.

enum class LockState { kUnlocked, kLocked, kUnknown };
LockState LockStateOf(const Object& object);

// Failure when it cannot be told.
bool IsLocked(const Object& object);

// Failure when the object is not in that state afterwards. What is damaged is told before anything
// has changed.
void SetLocked(const Object& object, bool locked);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_LOCK_H_

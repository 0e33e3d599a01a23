// Objects that go, and their metadata with them.
#ifndef MAVOEA_TOOLS_TRANSFER_REMOVAL_H_
#define MAVOEA_TOOLS_TRANSFER_REMOVAL_H_

#include <functional>

#include "tools/place/volume.h"

namespace mavoea::tool {

// Whether something that was found may go. What may not stays, and is a Failure.
using MayGo = std::function<bool(const struct stat&)>;

// Removes an object that is no directory, then what lies beside it. With `alone` false another
// object of its directory that would have the same metadata goes as well. Throws Failure.
void RemoveObject(const Object& object, bool alone, const MayGo& may_go);

// Removes a directory in which no object is left, with its EA directory, and what lies beside it.
// Throws Failure.
void RemoveEmptyDirectory(const Object& object, bool alone, const MayGo& may_go);

// Removes an object with all that is below it, which has been carried elsewhere: only what has, and
// is still what it was then. Throws Failure, and leaves what is above it.
void RemoveCarried(const Object& object, const MayGo& was_carried);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_REMOVAL_H_

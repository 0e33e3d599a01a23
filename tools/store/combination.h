// Putting what two places know of an object together.
#ifndef MAVOEA_TOOLS_STORE_COMBINATION_H_
#define MAVOEA_TOOLS_STORE_COMBINATION_H_

#include <string>
#include <vector>

#include "tools/store/metadata.h"

namespace mavoea::tool {

// An entry as it is to be written over `old`: the AFP word locks what it locked before, and nothing
// else.
Bytes WithLockOf(EntryId id, Bytes bytes, const Bytes& old);

enum class Wins { kThere, kOther };

// Adds another one's values to those that are there, and replaces them where the other wins. Adds
// those of which both have one, and not the same, to *differing. Whether anything has changed.
// Values are attributes, Finder info, fork and entries. Throws Failure.
bool Combine(const Metadata& other, Wins wins, Metadata* there,
             std::vector<std::string>* differing);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_COMBINATION_H_

// What a place can hold of what is known of an object.
#ifndef MAVOEA_TOOLS_STORE_FITTING_H_
#define MAVOEA_TOOLS_STORE_FITTING_H_

#include <cstdint>
#include <string>
#include <vector>

#include "tools/store/metadata.h"

namespace mavoea::tool {

// The path of a file; empty for none.
std::string HolderOf(const WholeFile& whole);

// What is damaged has no bytes to write, unless the whole file goes as it is. The reader has said
// so among the problems. Nor has a fork that stands for none.
void DropDamaged(Metadata* metadata);

// Entries that have no room go; `room` says how much there is.
void FitEntries(Metadata* metadata, std::uint32_t (*room)(EntryId), const char* where,
                std::vector<Missing>* missing);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FITTING_H_

// What earlier versions kept for an object, into the current layout.
#ifndef MAVOEA_TOOLS_STORE_ADOPTION_H_
#define MAVOEA_TOOLS_STORE_ADOPTION_H_

#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

struct Adoption {
    bool current = false;  // something lies in the current layout already
    std::vector<std::string>
        adopted;  // files of earlier layouts that have been converted, and are gone
    std::vector<std::string> notes;  // what stays though nothing is wrong, and the like
};

// What becomes of a "._" file of which everything has arrived. One that stays need not be on disk
// elsewhere when this returns.
enum class AppleDoubleFiles { kRemoved, kKept };

// Writes what only earlier layouts have into the current one, reads it back, and removes what has
// arrived, once it is on disk. Volumes that keep no EA directory have no earlier layout. Throws
// Failure when something could not be converted; everything else has been then.
Adoption Adopt(const Object& object, AppleDoubleFiles files = AppleDoubleFiles::kRemoved);

// The same before a change; says what was adopted. With nothing of the kind there, nothing is done.
void AdoptForChange(const Object& object, std::vector<std::string>* notes);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_ADOPTION_H_

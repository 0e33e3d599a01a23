// How an object is copied: what it keeps, and how its bytes go.
#ifndef MAVOEA_TOOLS_TRANSFER_MANNER_H_
#define MAVOEA_TOOLS_TRANSFER_MANNER_H_

#include <sys/types.h>

namespace mavoea::tool {

enum class Sparse { kAuto, kAlways, kNever };   // holes: as in the source, wherever there are zeros
enum class Reflink { kAuto, kAlways, kNever };  // blocks that both files share

// All that an object has, for moves and conversions.
struct Manner {
    // What is not kept is as a new file of this process has it, or as it was in a file that was
    // there. Metadata always travels.
    bool keeps_mode = true;  // and the ACL
    bool keeps_owner = true;
    bool keeps_times = true;
    bool keeps_attributes = true;  // those that are no metadata
    bool denies_mode = false;      // new files have none of the source's mode

    // Whether it is said what of it could not be kept.
    bool insists = false;

    bool data = true;  // attributes only otherwise

    // Nothing but metadata is copied, and the target is there.
    bool metadata_only = false;
    Sparse sparse = Sparse::kAuto;
    Reflink reflink = Reflink::kAuto;
    mode_t umask = 0;  // of this process
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_MANNER_H_

// mavoea salvage: what can still be read of an object's metadata, in files of its own.
#ifndef MAVOEA_TOOLS_EXCHANGE_SALVAGE_H_
#define MAVOEA_TOOLS_EXCHANGE_SALVAGE_H_

#include <string>

#include "tools/say/messages.h"

namespace mavoea::tool {

struct SalvageOptions {
    std::string path;
    std::string directory;  // which must not be there
    bool verbose = false;
    bool json = false;
};

// Into a new directory, for its owner alone: a file for each attribute, "FinderInfo",
// "ResourceFork", and so on, of what is damaged as much as is there; and "manifest.json", which
// says what is what. All of it has been read back and is on disk when this returns. kFailed when
// something could not be read, or is not whole; the rest is there then all the same. Throws
// Failure.
ExitStatus Salvage(const SalvageOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_SALVAGE_H_

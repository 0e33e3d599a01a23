// mavoea restore: metadata from a text, as getfattr --dump and mavoea save have it, onto objects.
#ifndef MAVOEA_TOOLS_EXCHANGE_RESTORE_H_
#define MAVOEA_TOOLS_EXCHANGE_RESTORE_H_

#include <optional>
#include <string>

#include "tools/say/messages.h"

namespace mavoea::tool {

struct RestoreOptions {
    std::string file;                      // "-": standard input
    std::string directory;                 // in which paths begin
    std::optional<std::string> from_type;  // of the volume that the text was made of
    bool absolute_names = false;           // of paths that begin with a slash, the root
    bool verbose = false;
    bool json = false;
};

// Values replace those of the same name, and what the text does not have stays. Paths lead to what
// is below the directory, and through no link. Goes on after a failure: an object of which a line
// is damaged stays as it is.
ExitStatus Restore(const RestoreOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_RESTORE_H_

// mavoea save: metadata of objects as text, as getfattr --dump has it.
#ifndef MAVOEA_TOOLS_EXCHANGE_SAVE_H_
#define MAVOEA_TOOLS_EXCHANGE_SAVE_H_

#include <optional>
#include <string>
#include <vector>

#include "tools/place/paths.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

struct SaveOptions {
    NamedPaths paths;
    bool recursive = false;
    std::optional<std::string> encoding;  // "text", "hex" or "base64"; for each value the best
    bool absolute_names = false;          // slashes at the beginning of paths stay
    std::optional<std::string> file;      // none: standard output
    bool force = false;                   // a file that is there is replaced
    bool json = false;                    // with a file only
};

// Changes nothing. Goes on after a failure; what could not be read, or has no place in the text, is
// named, and the status is not 0.
ExitStatus Save(const SaveOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_SAVE_H_

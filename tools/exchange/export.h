// mavoea export: what is known of an object, and its data, in one file.
#ifndef MAVOEA_TOOLS_EXCHANGE_EXPORT_H_
#define MAVOEA_TOOLS_EXCHANGE_EXPORT_H_

#include <string>

#include "tools/say/messages.h"

namespace mavoea::tool {

struct ExportOptions {
    std::string path;
    std::string file;    // "-": standard output
    std::string format;  // "appledouble" and so on
    bool force = false;  // a file that is there is replaced
    bool verbose = false;
    bool json = false;
};

// The file gets its name when it is whole, has been read back and is on disk. What the format has
// no place for is named, and the rest is written all the same.
ExitStatus Export(const ExportOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_EXPORT_H_

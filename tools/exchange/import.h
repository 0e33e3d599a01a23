// mavoea import: what a "._" file or an archive of a Mac holds, onto an object.
#ifndef MAVOEA_TOOLS_EXCHANGE_IMPORT_H_
#define MAVOEA_TOOLS_EXCHANGE_IMPORT_H_

#include <string>

#include "tools/say/messages.h"

namespace mavoea::tool {

struct ImportOptions {
    std::string file;
    std::string path;
    bool replaces_data = false;  // where the object's is another
    bool json = false;
};

// Everything is read before anything is written; values replace those of the same name, and what
// the file does not hold stays on the object. A part that cannot be stored does not keep the others
// from it. What holds data makes the object where it is missing, in a directory under the name that
// it has itself.
ExitStatus Import(const ImportOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_IMPORT_H_

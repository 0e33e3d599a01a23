// mavoea import -r: the "._" files that Macs have left in a tree, onto the objects that they belong
// to.
#ifndef MAVOEA_TOOLS_EXCHANGE_IMPORT_TREE_H_
#define MAVOEA_TOOLS_EXCHANGE_IMPORT_TREE_H_

#include <string>
#include <vector>

#include "tools/say/messages.h"

namespace mavoea::tool {

struct ImportTreeOptions {
    std::vector<std::string> directories;
    bool keep = false;           // the "._" files stay
    bool keep_existing = false;  // values that an object has stay
    bool verbose = false;        // what became of each "._" file is told
    bool json = false;
};

// Takes over what "._X" holds beside X, and what "__MACOSX/dir/._X" holds for "dir/X", as archives
// of Macs have it. Where there are several for one object the one beside it counts, then the
// innermost. A file goes when all of it has arrived, been read back and is on disk; what volumes
// keep in "._" files themselves is left alone, or brought into that program's layout. kSuccess when
// every file has arrived.
ExitStatus ImportTree(const ImportTreeOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_IMPORT_TREE_H_

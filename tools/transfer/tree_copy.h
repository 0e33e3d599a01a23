// Objects with all that is below them, one after the other, each reached through its directory.
#ifndef MAVOEA_TOOLS_TRANSFER_TREE_COPY_H_
#define MAVOEA_TOOLS_TRANSFER_TREE_COPY_H_

#include <functional>
#include <string>

#include "tools/say/messages.h"
#include "tools/transfer/transfer.h"

namespace mavoea::tool {

struct TreeCopyHooks {
    std::function<bool()> stopped = [] { return false; };  // nothing more is to be begun

    // Asked before an object, or a directory, is copied over `to`, which may be there. False: it is
    // skipped, with all that is below it. May throw Failure.
    std::function<bool(const Place& from, const struct stat& info, const Place& to)> may_take =
        [](const Place&, const struct stat&, const Place&) { return true; };

    std::function<void(const Place& from)> on_begin = [](const Place&) {};
    std::function<void(const Place& from, const Place& to)> on_done = [](const Place&,
                                                                         const Place&) {};
    std::function<void(const std::string& path, const Failure&)> on_failure;
    std::function<void()> on_skip = [] {};

    // Without: a directory is copied by itself, and special files for what they give.
    bool recursive = true;
};

// Goes on after a failure. Metadata of objects is no object of its own. No depth takes more than
// the heap, and some descriptors for each level.
void CopyTree(Transfer* transfer, const Place& from, const Place& to, const TreeCopyHooks& hooks);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_TREE_COPY_H_

// Two trees, object by object.
#ifndef MAVOEA_TOOLS_TRANSFER_TREE_COMPARISON_H_
#define MAVOEA_TOOLS_TRANSFER_TREE_COMPARISON_H_

#include <functional>
#include <vector>

#include "tools/place/directory.h"
#include "tools/say/messages.h"
#include "tools/transfer/comparison.h"

namespace mavoea::tool {

struct Pair {
    Place first;
    Place second;
};

enum class Side { kFirst, kSecond };

struct TreeReceiver {
    std::function<void(const Pair&)> on_pair;  // that is looked at next
    // Of two that are there; none when they are equal.
    std::function<void(const Pair&, const std::vector<Difference>&)> compared;
    // Of two one is there.
    std::function<void(const Pair&, Side)> alone;
    std::function<void(const Pair&, const Failure&)> fails;
    std::function<bool()> stopped;                         // nothing more is to be begun
    std::function<bool()> give_up = [] { return false; };  // asked while data is read
};

// Compares the two, and in recursive work all below them that has a name on either side, in the
// order of the names; symbolic links are objects. Goes on after a failure.
void CompareTrees(const Pair& top, bool recursive, const Compared& compared,
                  const TreeReceiver& receiver);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_TREE_COMPARISON_H_

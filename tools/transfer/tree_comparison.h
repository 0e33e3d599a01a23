// Two trees, object by object.
#ifndef MAVOEA_TOOLS_TRANSFER_TREE_COMPARISON_H_
#define MAVOEA_TOOLS_TRANSFER_TREE_COMPARISON_H_

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/place/directory.h"
#include "tools/say/messages.h"
#include "tools/transfer/comparison.h"
#include "tools/walk/crew.h"

namespace mavoea::tool {

struct Pair {
    Place first;
    Place second;
};

enum class Side { kFirst, kSecond };

// The first three, and what they change of the receiver, may be called in any of the processes that
// share the work; what they write comes out in the order of the pairs.
struct TreeReceiver {
    // Of two that are there; none when they are equal.
    std::function<void(const Pair&, const std::vector<Difference>&)> compared;
    // Of two one is there.
    std::function<void(const Pair&, Side)> alone;
    std::function<void(const Pair&, const Failure&)> fails;
    // What these have changed since this was last called, taken off in their process; and added in
    // the first one.
    std::function<std::string()> take;
    std::function<void(std::string_view)> add;

    // Of a process that has died with a pair in hand.
    std::function<void(const std::string& path, const Failure&)> on_failure;
    std::function<void()> clear_progress;
    std::function<void(const std::string& path)> show_progress;
    std::function<bool()> stopped;                         // nothing more is to be begun
    std::function<bool()> give_up = [] { return false; };  // asked while data is read
};

// Compares the two, and in recursive work all below them that has a name on either side, in the
// order of the names; symbolic links are objects. Goes on after a failure.
void CompareTrees(const Pair& top, bool recursive, const Compared& compared, CrewSize crew,
                  const TreeReceiver& receiver);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_TREE_COMPARISON_H_

// How many objects there are where recursive work goes.
#ifndef MAVOEA_TOOLS_WALK_COUNTING_H_
#define MAVOEA_TOOLS_WALK_COUNTING_H_

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "tools/walk/shard.h"

namespace mavoea::tool {

// Counts them in a process beside the work, which looks at names only, once somebody sees how far
// the work is. In its scope progress says so.
class Counting {
 public:
    // What copies take along, or what is visited: no links, and nothing of hidden directories.
    enum class Kind { kVisited, kCopied };

    // `paths` are counted with all that is below them. `shard`: only its objects.
    Counting(Kind kind, std::vector<std::string> paths, Shard shard = {});
    ~Counting();
    Counting(const Counting&) = delete;
    Counting& operator=(const Counting&) = delete;

 private:
    struct Shared;

    std::optional<std::uint64_t> Total();
    void Begin();
    std::uint64_t Count() const;

    Kind kind_;
    std::vector<std::string> paths_;
    Shard shard_;
    Shared* shared_ = nullptr;
    pid_t process_ = -1;
    bool begun_ = false;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_COUNTING_H_

// The share of the objects that one of several processes takes, by a hash of their paths.
// docs/sharding.md has it for those who compute it elsewhere.
#ifndef MAVOEA_TOOLS_WALK_SHARD_H_
#define MAVOEA_TOOLS_WALK_SHARD_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "util/fnv.h"

namespace mavoea::tool {

// Of the path of an object from what somebody named, with the last name of that in front:
// "share/letters/a.txt" below "/srv/share". Machines of other builds and byte orders, that have the
// share mounted elsewhere, compute the same: it must never change.
//
// FNV-1a of 64 bits over the path's bytes; then its bits are mixed, since its low ones depend on
// too few of those of the last bytes. Made name by name, as a tree is walked.
class PathHash {
 public:
    constexpr PathHash() = default;

    // Of what somebody named. "/", and what ends in "." or "..", has no name: what is below it is
    // hashed without one.
    static constexpr PathHash OfNamed(std::string_view path) {
        while (path.ends_with('/')) path.remove_suffix(1);
        const std::string_view name = path.substr(path.rfind('/') + 1);
        const bool has_name = !name.empty() && name != "." && name != "..";
        return has_name ? PathHash().Below(name) : PathHash();
    }

    // Of an entry of the directory that this one is of.
    constexpr PathHash Below(std::string_view name) const {
        PathHash hash = *this;
        if (!hash.empty_) hash.hash_.Add("/");
        hash.hash_.Add(name);
        hash.empty_ = false;
        return hash;
    }

    constexpr std::uint64_t value() const {
        std::uint64_t mixed = hash_.value();
        mixed = (mixed ^ mixed >> 33) * 0xFF51AFD7ED558CCDU;
        mixed = (mixed ^ mixed >> 33) * 0xC4CEB9FE1A85EC53U;
        return mixed ^ mixed >> 33;
    }

 private:
    Fnv hash_;
    bool empty_ = true;
};

struct Shard {
    std::uint32_t index = 1;  // 1 to `count`
    std::uint32_t count = 1;

    constexpr bool Has(PathHash hash) const { return hash.value() % count == index - 1; }
};

// "3/16"; none for what is no shard. There may be up to a million.
std::optional<Shard> ParseShard(std::string_view text);
std::string ShardText(Shard shard);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_SHARD_H_

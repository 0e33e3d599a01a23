#include "tools/walk/shard.h"

#include <charconv>

namespace mavoea::tool {
namespace {

// These values are on other machines, too.
static_assert(PathHash().value() == 0xEFD01F60BA992926U);
static_assert(PathHash().Below("share").value() == 0xE632AE8FA0A69E61U);
static_assert(PathHash().Below("share").Below("letters").Below("a.txt").value() ==
              0x8DFDCBF138D48558U);
static_assert(PathHash().Below("share").Below("\xFF\n\xC3\xA9").value() == 0x758787D4F71BF399U);

static_assert(PathHash::OfNamed("/srv/share//").value() == PathHash().Below("share").value());
static_assert(PathHash::OfNamed("share").value() == PathHash().Below("share").value());
static_assert(PathHash::OfNamed("/srv/.").value() == PathHash().value());
static_assert(PathHash::OfNamed("..").value() == PathHash().value());
static_assert(PathHash::OfNamed("/").value() == PathHash().value());

constexpr std::uint32_t kMost = 1'000'000;

// Decimal digits and nothing else.
std::optional<std::uint32_t> ParseNumber(std::string_view text) {
    std::uint32_t number = 0;
    const char* const end = text.data() + text.size();
    const auto [stop, error] = std::from_chars(text.data(), end, number);
    if (error != std::errc() || stop != end) return std::nullopt;
    return number;
}

}  // namespace

std::optional<Shard> ParseShard(std::string_view text) {
    const std::size_t slash = text.find('/');
    if (slash == std::string_view::npos) return std::nullopt;
    const auto index = ParseNumber(text.substr(0, slash));
    const auto count = ParseNumber(text.substr(slash + 1));
    if (!index || !count || *index < 1 || *index > *count || *count > kMost) return std::nullopt;
    return Shard{*index, *count};
}

std::string ShardText(Shard shard) {
    return std::to_string(shard.index) + '/' + std::to_string(shard.count);
}

}  // namespace mavoea::tool

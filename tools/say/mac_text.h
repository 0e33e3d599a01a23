// Names and times as archives of Macs have them.
#ifndef MAVOEA_TOOLS_SAY_MAC_TEXT_H_
#define MAVOEA_TOOLS_SAY_MAC_TEXT_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace mavoea::tool {

// A name in Mac OS Roman, as UTF-8; and the other way, none where a letter has no place there.
std::string FromMacRoman(std::string_view name);
std::optional<std::string> ToMacRoman(std::string_view name);

// Whether it is UTF-8, without overlong forms and surrogates.
bool IsUtf8(std::string_view text);

// What the dates of AppleDouble entries count from, 2000-01-01 UTC, in seconds since 1970-01-01.
inline constexpr std::int64_t kAfpEpoch = 946684800;

// Seconds since 1970-01-01 UTC, and since 1904-01-01 in local time; none where the other has no
// place for that, or would mean another time when it is read again.
std::optional<std::int64_t> FromMacTime(std::uint32_t time);
std::optional<std::uint32_t> ToMacTime(std::int64_t time);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_MAC_TEXT_H_

// Times as people and programs read them: ISO 8601, in UTC.
#ifndef MAVOEA_TOOLS_SHOW_DATES_H_
#define MAVOEA_TOOLS_SHOW_DATES_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace mavoea::tool {

// "2024-05-01T09:30:00Z", of seconds since 1970-01-01 UTC; none before the year 0 and after 9999.
std::optional<std::string> DateText(std::int64_t seconds);

// The same of what Windows counts, in 100 ns from 1601-01-01 UTC: with seven digits behind the
// second where they are not all 0.
std::optional<std::string> WindowsDateText(std::uint64_t time);

// Seconds since 1970-01-01 UTC, of "2024-05-01", "2024-05-01T09:30:00" and "2024-05-01 09:30:00",
// with or without a "Z". None of anything else, dates that no calendar has among it.
std::optional<std::int64_t> ParseDate(std::string_view text);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_DATES_H_

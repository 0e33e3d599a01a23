#include "tools/show/dates.h"

#include <array>
#include <chrono>
#include <cstdio>

namespace mavoea::tool {
namespace {

// time_t and what takes it have 32 bits on some machines: the calendar of <chrono> has 64.
using std::chrono::days;
using std::chrono::sys_days;
using std::chrono::year_month_day;

constexpr std::int64_t kSecondsPerDay = 86400;
constexpr std::int64_t kYear0 = -62167219200;  // seconds from 1970
constexpr std::int64_t kYear10000 = 253402300800;
constexpr std::uint64_t kWindowsTicks = 10000000;  // a second
constexpr std::int64_t kWindowsEpoch = -11644473600;

// "YYYY-MM-DDThh:mm:ss", of seconds that are in range.
std::string Text(std::int64_t seconds) {
    std::int64_t day = seconds / kSecondsPerDay;
    if (seconds % kSecondsPerDay < 0) --day;
    const year_month_day date(sys_days(days(static_cast<days::rep>(day))));
    const auto second = static_cast<int>(seconds - day * kSecondsPerDay);
    std::array<char, 48> text{};
    std::snprintf(text.data(), text.size(), "%04d-%02u-%02uT%02d:%02d:%02d",
                  static_cast<int>(date.year()), static_cast<unsigned>(date.month()),
                  static_cast<unsigned>(date.day()), second / 3600, second / 60 % 60, second % 60);
    return text.data();
}

// Takes that many digits off `text`, and what comes behind them; none where there are other
// letters.
std::optional<int> TakeNumber(std::string_view* text, std::size_t digits, std::string_view behind) {
    if (text->size() < digits + (behind.empty() ? 0 : 1)) return std::nullopt;
    int number = 0;
    for (std::size_t i = 0; i < digits; ++i) {
        const char digit = (*text)[i];
        if (digit < '0' || digit > '9') return std::nullopt;
        number = 10 * number + (digit - '0');
    }
    text->remove_prefix(digits);
    if (behind.empty()) return number;
    if (behind.find(text->front()) == std::string_view::npos) return std::nullopt;
    text->remove_prefix(1);
    return number;
}

}  // namespace

std::optional<std::string> DateText(std::int64_t seconds) {
    if (seconds < kYear0 || seconds >= kYear10000) return std::nullopt;
    return Text(seconds) + 'Z';
}

std::optional<std::string> WindowsDateText(std::uint64_t time) {
    const auto seconds = kWindowsEpoch + static_cast<std::int64_t>(time / kWindowsTicks);
    if (seconds >= kYear10000) return std::nullopt;
    std::string text = Text(seconds);
    if (const std::uint64_t rest = time % kWindowsTicks; rest != 0) {
        text += '.' + std::to_string(kWindowsTicks + rest).substr(1);
    }
    return text + 'Z';
}

std::optional<std::int64_t> ParseDate(std::string_view text) {
    if (text.ends_with('Z')) text.remove_suffix(1);
    const auto year = TakeNumber(&text, 4, "-");
    const auto month = year ? TakeNumber(&text, 2, "-") : std::nullopt;
    const auto day = month ? TakeNumber(&text, 2, text.size() > 2 ? "T " : "") : std::nullopt;
    if (!day) return std::nullopt;
    const year_month_day date(std::chrono::year(*year),
                              std::chrono::month(static_cast<unsigned>(*month)),
                              std::chrono::day(static_cast<unsigned>(*day)));
    if (!date.ok()) return std::nullopt;
    const sys_days day_count = date;
    const std::int64_t day_number = day_count.time_since_epoch().count();
    const std::int64_t midnight = day_number * kSecondsPerDay;
    if (text.empty()) return midnight;
    const auto hour = TakeNumber(&text, 2, ":");
    const auto minute = hour ? TakeNumber(&text, 2, ":") : std::nullopt;
    const auto second = minute ? TakeNumber(&text, 2, "") : std::nullopt;
    if (!second || !text.empty() || *hour > 23 || *minute > 59 || *second > 59) return std::nullopt;
    const int seconds = *hour * 3600 + *minute * 60 + *second;
    return midnight + seconds;
}

}  // namespace mavoea::tool

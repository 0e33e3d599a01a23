#include "tools/say/mac_text.h"

#include <algorithm>
#include <array>
#include <ctime>

#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

// What the bytes from 0x80 on mean; those before are ASCII.
constexpr std::array<std::uint16_t, 128> kMacRoman = {
    0x00C4, 0x00C5, 0x00C7, 0x00C9, 0x00D1, 0x00D6, 0x00DC, 0x00E1, 0x00E0, 0x00E2, 0x00E4, 0x00E3,
    0x00E5, 0x00E7, 0x00E9, 0x00E8, 0x00EA, 0x00EB, 0x00ED, 0x00EC, 0x00EE, 0x00EF, 0x00F1, 0x00F3,
    0x00F2, 0x00F4, 0x00F6, 0x00F5, 0x00FA, 0x00F9, 0x00FB, 0x00FC, 0x2020, 0x00B0, 0x00A2, 0x00A3,
    0x00A7, 0x2022, 0x00B6, 0x00DF, 0x00AE, 0x00A9, 0x2122, 0x00B4, 0x00A8, 0x2260, 0x00C6, 0x00D8,
    0x221E, 0x00B1, 0x2264, 0x2265, 0x00A5, 0x00B5, 0x2202, 0x2211, 0x220F, 0x03C0, 0x222B, 0x00AA,
    0x00BA, 0x03A9, 0x00E6, 0x00F8, 0x00BF, 0x00A1, 0x00AC, 0x221A, 0x0192, 0x2248, 0x2206, 0x00AB,
    0x00BB, 0x2026, 0x00A0, 0x00C0, 0x00C3, 0x00D5, 0x0152, 0x0153, 0x2013, 0x2014, 0x201C, 0x201D,
    0x2018, 0x2019, 0x00F7, 0x25CA, 0x00FF, 0x0178, 0x2044, 0x20AC, 0x2039, 0x203A, 0xFB01, 0xFB02,
    0x2021, 0x00B7, 0x201A, 0x201E, 0x2030, 0x00C2, 0x00CA, 0x00C1, 0x00CB, 0x00C8, 0x00CD, 0x00CE,
    0x00CF, 0x00CC, 0x00D3, 0x00D4, 0xF8FF, 0x00D2, 0x00DA, 0x00DB, 0x00D9, 0x0131, 0x02C6, 0x02DC,
    0x00AF, 0x02D8, 0x02D9, 0x02DA, 0x00B8, 0x02DD, 0x02DB, 0x02C7,
};

constexpr std::int64_t kMacEpoch = -2082844800;  // 1904-01-01, in seconds since 1970-01-01

}  // namespace

std::string FromMacRoman(std::string_view name) {
    std::string text;
    for (const char c : name) {
        const auto byte = static_cast<std::uint8_t>(c);
        const std::uint32_t letter = byte < 0x80 ? byte : kMacRoman[byte - 0x80U];
        if (letter < 0x80) {
            text += c;
        } else if (letter < 0x800) {
            text += static_cast<char>(0xC0 | letter >> 6);
            text += static_cast<char>(0x80 | (letter & 0x3F));
        } else {
            text += static_cast<char>(0xE0 | letter >> 12);
            text += static_cast<char>(0x80 | (letter >> 6 & 0x3F));
            text += static_cast<char>(0x80 | (letter & 0x3F));
        }
    }
    return text;
}

std::optional<std::string> ToMacRoman(std::string_view name) {
    std::string text;
    while (!name.empty()) {
        const std::uint32_t letter = TakeLetter(&name);
        if (letter < 0x80) {
            text += static_cast<char>(letter);
            continue;
        }
        const auto* const found = std::find(kMacRoman.begin(), kMacRoman.end(), letter);
        if (found == kMacRoman.end()) return std::nullopt;
        text += static_cast<char>(0x80 + (found - kMacRoman.begin()));
    }
    return text;
}

bool IsUtf8(std::string_view text) {
    while (!text.empty()) {
        if (TakeLetter(&text) == kNoLetter) return false;
    }
    return true;
}

std::optional<std::int64_t> FromMacTime(std::uint32_t time) {
    // The same figures on a clock in Greenwich are what a clock here is to show.
    const std::int64_t shown = kMacEpoch + time;
    const auto seconds = static_cast<std::time_t>(shown);
    std::tm clock = {};
    if (seconds != shown || ::gmtime_r(&seconds, &clock) == nullptr) return std::nullopt;
    clock.tm_isdst = -1;
    return std::int64_t{std::mktime(&clock)};
}

std::optional<std::uint32_t> ToMacTime(std::int64_t time) {
    const auto seconds = static_cast<std::time_t>(time);
    std::tm clock = {};
    if (seconds != time || ::localtime_r(&seconds, &clock) == nullptr) return std::nullopt;
    const std::int64_t since = time + clock.tm_gmtoff - kMacEpoch;
    if (since <= 0 || since > UINT32_MAX) return std::nullopt;
    const auto mac = static_cast<std::uint32_t>(since);
    if (FromMacTime(mac) != time) return std::nullopt;
    return mac;
}

}  // namespace mavoea::tool

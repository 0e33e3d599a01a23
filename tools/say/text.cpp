#include "tools/say/text.h"

#include <algorithm>
#include <array>
#include <utility>

namespace mavoea::tool {
namespace {

constexpr std::string_view kDigits = "0123456789abcdef";
constexpr std::string_view kCapitalDigits = "0123456789ABCDEF";

constexpr bool IsPrintable(std::uint8_t byte) { return byte >= 0x20 && byte < 0x7F; }

constexpr int DigitValue(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

constexpr bool IsBlank(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }

// The byte that two digits mean at that place; none where there are none.
constexpr std::optional<std::uint8_t> HexByte(std::string_view text, std::size_t at) {
    if (at + 1 >= text.size()) return std::nullopt;
    const int high = DigitValue(text[at]);
    const int low = DigitValue(text[at + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    return static_cast<std::uint8_t>(high << 4 | low);
}

}  // namespace

std::string HexNumber(std::uint64_t value, int digits) {
    std::string text = "0x";
    for (int i = digits; i-- > 0;) text += kCapitalDigits[value >> (4 * i) & 0xF];
    return text;
}

std::string HexDigits(ByteView bytes) {
    std::string text;
    text.reserve(2 * bytes.size());
    for (const std::uint8_t byte : bytes) {
        text += kDigits[byte >> 4];
        text += kDigits[byte & 0xF];
    }
    return text;
}

std::optional<Bytes> ParseHex(std::string_view text) {
    if (text.starts_with("0x") || text.starts_with("0X")) text.remove_prefix(2);
    Bytes bytes;
    for (std::size_t at = 0; at < text.size();) {
        if (IsBlank(text[at]) || text[at] == ':') {
            ++at;
            continue;
        }
        const auto byte = HexByte(text, at);
        if (!byte) return std::nullopt;
        bytes.push_back(*byte);
        at += 2;
    }
    return bytes;
}

std::string Base64(ByteView bytes) {
    constexpr std::string_view kLetters =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    constexpr std::size_t kGroup = 3;
    std::string text;
    text.reserve((bytes.size() + kGroup - 1) / kGroup * 4);
    for (std::size_t at = 0; at < bytes.size(); at += kGroup) {
        const ByteView group = bytes.subspan(at, std::min(kGroup, bytes.size() - at));
        std::uint32_t bits = 0;
        for (std::size_t i = 0; i < kGroup; ++i) {
            bits = bits << 8 | (i < group.size() ? group[i] : 0U);
        }
        for (std::size_t i = 0; i <= kGroup; ++i) {
            text += i <= group.size() ? kLetters[bits >> (18 - 6 * i) & 0x3F] : '=';
        }
    }
    return text;
}

std::string HexDump(ByteView bytes) {
    constexpr std::size_t kPerLine = 16;
    std::string text;
    for (std::size_t at = 0; at < bytes.size(); at += kPerLine) {
        const ByteView line = bytes.subspan(at, std::min(kPerLine, bytes.size() - at));
        text += HexNumber(at).substr(2) + ' ';
        for (std::size_t i = 0; i < kPerLine; ++i) {
            if (i == kPerLine / 2) text += ' ';
            text += ' ';
            text += i < line.size() ? HexDigits(line.subspan(i, 1)) : "  ";
        }
        text += "  |";
        for (const std::uint8_t byte : line) {
            text += IsPrintable(byte) ? static_cast<char>(byte) : '.';
        }
        text += "|\n";
    }
    return text;
}

std::string Printable(std::string_view text) {
    std::string safe;
    bool in_control = false;
    for (std::size_t i = 0; i < text.size(); ++i) {
        const auto byte = static_cast<std::uint8_t>(text[i]);
        const bool ends_control = std::exchange(in_control, false);
        // U+0080 to U+009F, some of which begin what terminals do.
        in_control = byte == 0xC2 && i + 1 < text.size() &&
                     (static_cast<std::uint8_t>(text[i + 1]) & 0xE0U) == 0x80;
        if (byte == '\\') {
            safe += "\\\\";
        } else if (byte < 0x20 || byte == 0x7F || in_control || ends_control) {
            safe += "\\x" + HexNumber(byte, 2).substr(2);
        } else {
            safe += text[i];
        }
    }
    return safe;
}

std::optional<std::string> FromPrintable(std::string_view text) {
    std::string plain;
    for (std::size_t at = 0; at < text.size(); ++at) {
        if (text[at] != '\\') {
            plain += text[at];
            continue;
        }
        const char kind = ++at < text.size() ? text[at] : '\0';
        const auto byte = kind == 'x' ? HexByte(text, at + 1) : std::nullopt;
        if (kind == '\\') {
            plain += kind;
        } else if (byte.value_or(0) != 0) {
            plain += static_cast<char>(*byte);
            at += 2;
        } else {
            return std::nullopt;
        }
    }
    return plain;
}

std::uint32_t TakeLetter(std::string_view* text) {
    const auto byte = [&](std::size_t i) { return static_cast<std::uint8_t>((*text)[i]); };
    const std::uint8_t first = byte(0);
    const std::size_t size = first < 0x80 ? 1 : first < 0xE0 ? 2 : first < 0xF0 ? 3 : 4;
    if ((first >= 0x80 && first < 0xC2) || first > 0xF4 || size > text->size()) return kNoLetter;
    std::uint32_t letter = size == 1 ? first : first & (0x7FU >> size);
    for (std::size_t i = 1; i < size; ++i) {
        if ((byte(i) & 0xC0) != 0x80) return kNoLetter;
        letter = letter << 6 | (byte(i) & 0x3FU);
    }
    constexpr std::array<std::uint32_t, 5> kLeast = {0, 0, 0x80, 0x800, 0x10000};
    if (letter < kLeast[size] || letter > 0x10FFFF) return kNoLetter;
    if (letter >= 0xD800 && letter < 0xE000) return kNoLetter;
    text->remove_prefix(size);
    return letter;
}

bool IsShownByTerminals(std::string_view text) {
    while (!text.empty()) {
        const std::uint32_t letter = TakeLetter(&text);
        const bool control = letter < 0x20 || (letter >= 0x7F && letter < 0xA0);
        if (letter == kNoLetter || (control && letter != '\t' && letter != '\n')) return false;
    }
    return true;
}

}  // namespace mavoea::tool

#include "tools/say/text.h"

#include <algorithm>
#include <array>

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
    Bytes bytes;
    for (std::size_t at = 0; at < text.size();) {
        if (IsBlank(text[at])) {
            ++at;
            continue;
        }
        const int high = DigitValue(text[at]);
        const int low = at + 1 < text.size() ? DigitValue(text[at + 1]) : -1;
        if (high < 0 || low < 0) return std::nullopt;
        bytes.push_back(static_cast<std::uint8_t>(high << 4 | low));
        at += 2;
    }
    return bytes;
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
    for (const char c : text) {
        const auto byte = static_cast<std::uint8_t>(c);
        if (c == '\\') {
            safe += "\\\\";
        } else if (byte < 0x20 || byte == 0x7F) {
            safe += "\\x" + HexNumber(byte, 2).substr(2);
        } else {
            safe += c;
        }
    }
    return safe;
}

}  // namespace mavoea::tool

// Bytes and names as text.
#ifndef MAVOEA_TOOLS_SAY_TEXT_H_
#define MAVOEA_TOOLS_SAY_TEXT_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "util/bytes.h"

namespace mavoea::tool {

using Bytes = std::vector<std::uint8_t>;

// `digits` hexadecimal digits behind "0x".
std::string HexNumber(std::uint64_t value, int digits = 8);

// Two digits a byte, without blanks.
std::string HexDigits(ByteView bytes);

// The bytes that pairs of hexadecimal digits mean, behind "0x" or not; white space and colons
// between pairs are ignored. None when it is anything else.
std::optional<Bytes> ParseHex(std::string_view text);

// Four characters for each three bytes, the last ones filled up by '='. What is encoded in pieces
// of a multiple of three bytes is the same as in one.
std::string Base64(ByteView bytes);

// 16 bytes a line: offset, digits, text.
std::string HexDump(ByteView bytes);

// A name or path on one line of a terminal: control characters as "\x0A", a backslash doubled, all
// other bytes as they are.
std::string Printable(std::string_view text);

// What Printable() has made of it, undone; "\\x" and two digits stand for any byte but NUL. None
// when an escape is broken.
std::optional<std::string> FromPrintable(std::string_view text);

// Takes the first letter off `text`, which is not empty; kNoLetter where that is no UTF-8, overlong
// forms and surrogates among it.
inline constexpr std::uint32_t kNoLetter = UINT32_MAX;
std::uint32_t TakeLetter(std::string_view* text);

// Whether a terminal shows all of it and does nothing besides: UTF-8 without control characters,
// but for tabs and line ends.
bool IsShownByTerminals(std::string_view text);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_TEXT_H_

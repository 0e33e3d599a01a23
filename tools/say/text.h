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

// The bytes that pairs of hexadecimal digits mean, white space between pairs ignored; none when it
// is anything else.
std::optional<Bytes> ParseHex(std::string_view text);

// 16 bytes a line: offset, digits, text.
std::string HexDump(ByteView bytes);

// A name or path on one line of a terminal: control characters as "\x0A", a backslash doubled, all
// other bytes as they are.
std::string Printable(std::string_view text);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_TEXT_H_

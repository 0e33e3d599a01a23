// Extended attributes as text, as getfattr --dump writes them and setfattr --restore reads them.
//
//   # file: PATH          begins an object
//   NAME="TEXT"           an attribute and its value, in one of three encodings
//   NAME=0xDIGITS         two digits a byte
//   NAME=0sBASE64
//   NAME                  an empty value, as NAME="" is one
//                         an empty line ends the object
//
// In paths and names "\ooo", three octal digits, stands for a byte: for '\' itself, for line feeds
// and carriage returns, and in names for '='. In TEXT one to three digits do, and "\\" and "\""
// stand for what is behind the backslash. TEXT without quotes is one value, too. getfattr leaves
// the NUL out that is at the end of a text. Lines end with line feeds, or carriage returns and
// these; others that begin with '#' are comments.
//
// setfattr takes a backslash that begins none of these for itself; here that is damage.
#ifndef MAVOEA_FORMAT_ATTRIBUTE_TEXT_H_
#define MAVOEA_FORMAT_ATTRIBUTE_TEXT_H_

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "util/bytes.h"

namespace mavoea {

inline constexpr std::string_view kObjectLine = "# file: ";

enum class TextEncoding { kText, kHex, kBase64 };

// ---- Reading ------------------------------------------------------------------------------------

// A line without its end, taken apart; nothing of it is decoded.
struct AttributeTextLine {
    enum class Kind { kEmpty, kObject, kComment, kAttribute };

    Kind kind = Kind::kEmpty;
    std::string_view name;   // or the path
    std::string_view value;  // empty where there is none
};
AttributeTextLine ParseAttributeTextLine(std::string_view line);

// What is wrong with a path, a name or a value, in words for people; null where nothing is.
using TextProblem = const char*;

struct DecodedText {
    TextProblem problem = nullptr;
    std::size_t size = 0;  // of what was decoded, in bytes
    TextEncoding encoding = TextEncoding::kText;
};

// Both decode into `to`, which has as many bytes as the text at least. No NUL comes out of a path
// or a name, and at least one byte.
DecodedText DecodeTextName(std::string_view text, ByteSpan to);
DecodedText DecodeTextValue(std::string_view text, ByteSpan to);

// Whether a value that stands at the end of a text, without a line's end, is all there: it has both
// quotes.
bool IsWholeTextValue(std::string_view value);

// ---- Writing ------------------------------------------------------------------------------------

// Whether getfattr would choose text for a value, and that gives back every byte. The value comes
// piece by piece.
class TextChoice {
 public:
    void Add(ByteView bytes);
    TextEncoding Best() const;

 private:
    std::uint64_t size_ = 0;
    std::uint64_t unprintable_ = 0;
    bool ends_with_nul_ = false;
};

// Writes one value, piece by piece. `put` takes a string_view of characters.
template <class Put>
class TextValueWriter {
 public:
    TextValueWriter(TextEncoding encoding, Put put) : encoding_(encoding), put_(put) {
        put_(encoding == TextEncoding::kText  ? std::string_view("\"")
             : encoding == TextEncoding::kHex ? std::string_view("0x")
                                              : std::string_view("0s"));
    }
    void Write(ByteView bytes) {
        for (const std::uint8_t byte : bytes) PutByte(byte);
    }
    // Once, behind the last piece.
    void End() {
        if (encoding_ == TextEncoding::kText) put_(std::string_view("\""));
        if (group_size_ > 0) PutGroup();
    }

 private:
    void PutByte(std::uint8_t byte);
    void PutGroup();

    TextEncoding encoding_;
    Put put_;
    std::array<std::uint8_t, 3> group_{};  // of base64
    std::size_t group_size_ = 0;
};

// A path (kPath) or an attribute's name as it stands in a line.
enum class TextName { kPath, kAttribute };
template <class Put>
void PutTextName(TextName kind, std::string_view name, Put put);

// "\ooo".
constexpr std::array<char, 4> OctalEscape(std::uint8_t byte) {
    return {'\\', static_cast<char>('0' + (byte >> 6)), static_cast<char>('0' + (byte >> 3 & 7)),
            static_cast<char>('0' + (byte & 7))};
}

inline constexpr std::string_view kTextHexDigits = "0123456789abcdef";
inline constexpr std::string_view kBase64Digits =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
static_assert(kBase64Digits.size() == 64);

template <class Put>
void TextValueWriter<Put>::PutByte(std::uint8_t byte) {
    const auto put_escape = [&](const auto& escape) {
        put_(std::string_view(escape.data(), escape.size()));
    };
    switch (encoding_) {
        case TextEncoding::kText: {
            const char c = static_cast<char>(byte);
            if (c == '\0' || c == '\n' || c == '\r') return put_escape(OctalEscape(byte));
            if (c == '\\' || c == '"') return put_escape(std::array<char, 2>{'\\', c});
            return put_(std::string_view(&c, 1));
        }
        case TextEncoding::kHex:
            return put_escape(
                std::array<char, 2>{kTextHexDigits[byte >> 4], kTextHexDigits[byte & 0xF]});
        case TextEncoding::kBase64:
            group_[group_size_++] = byte;
            if (group_size_ == group_.size()) PutGroup();
            return;
    }
}

template <class Put>
void TextValueWriter<Put>::PutGroup() {
    std::fill(group_.begin() + static_cast<std::ptrdiff_t>(group_size_), group_.end(),
              std::uint8_t{0});
    const std::uint32_t bits =
        std::uint32_t{group_[0]} << 16 | std::uint32_t{group_[1]} << 8 | group_[2];
    std::array<char, 4> digits{};
    for (std::size_t i = 0; i < digits.size(); ++i) {
        digits[i] = i > group_size_ ? '=' : kBase64Digits[bits >> (18 - 6 * i) & 63];
    }
    put_(std::string_view(digits.data(), digits.size()));
    group_size_ = 0;
}

template <class Put>
void PutTextName(TextName kind, std::string_view name, Put put) {
    for (const char c : name) {
        const bool escaped =
            c == '\\' || c == '\n' || c == '\r' || (c == '=' && kind == TextName::kAttribute);
        if (!escaped) {
            put(std::string_view(&c, 1));
            continue;
        }
        const auto escape = OctalEscape(static_cast<std::uint8_t>(c));
        put(std::string_view(escape.data(), escape.size()));
    }
}

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_ATTRIBUTE_TEXT_H_

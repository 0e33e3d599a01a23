#include "format/attribute_text.h"

#include <algorithm>

namespace mavoea {
namespace {

constexpr TextProblem kNulByte = "a NUL byte stands in it";

bool IsOctal(char c) { return c >= '0' && c <= '7'; }
bool IsBlank(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }

int HexDigit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

int Base64Digit(char c) {
    if (c >= 'A' && c <= 'Z') return c - 'A';
    if (c >= 'a' && c <= 'z') return c - 'a' + 26;
    if (c >= '0' && c <= '9') return c - '0' + 52;
    if (c == '+') return 62;
    return c == '/' ? 63 : -1;
}

// The byte of `least` to three octal digits that `text` begins with, which are taken off.
std::optional<std::uint8_t> TakeOctal(std::string_view* text, std::size_t least) {
    unsigned value = 0;
    std::size_t count = 0;
    for (; count < 3 && count < text->size() && IsOctal((*text)[count]); ++count) {
        value = value << 3 | static_cast<unsigned>((*text)[count] - '0');
    }
    if (count < least || value > UINT8_MAX) return std::nullopt;
    text->remove_prefix(count);
    return static_cast<std::uint8_t>(value);
}

// Where what is decoded goes; it is never longer than the text.
class Output {
 public:
    explicit Output(ByteSpan to) : to_(to) {}

    void Put(std::uint8_t byte) {
        if (size_ < to_.size()) to_[size_] = byte;
        ++size_;
    }
    std::size_t size() const { return size_; }

 private:
    ByteSpan to_;
    std::size_t size_ = 0;
};

char Take(std::string_view* text) {
    const char c = text->front();
    text->remove_prefix(1);
    return c;
}

TextProblem DecodeQuoted(std::string_view text, Output* out) {
    constexpr TextProblem kOpen = "its value has no closing quote";
    const bool quoted = text.starts_with('"');
    if (quoted) {
        if (text.size() < 2 || !text.ends_with('"')) return kOpen;
        text = text.substr(1, text.size() - 2);
    }
    while (!text.empty()) {
        const char c = Take(&text);
        if (c != '\\') {
            out->Put(static_cast<std::uint8_t>(c));
            continue;
        }
        // What seemed to close it is meant.
        if (text.empty() && quoted) return kOpen;
        if (text.starts_with('\\') || text.starts_with('"')) {
            out->Put(static_cast<std::uint8_t>(Take(&text)));
        } else if (const auto byte = TakeOctal(&text, 1)) {
            out->Put(*byte);
        } else {
            return "a backslash in its value begins no escape";
        }
    }
    return nullptr;
}

TextProblem DecodeHex(std::string_view text, Output* out) {
    int high = -1;
    for (const char c : text) {
        if (IsBlank(c)) continue;
        const int digit = HexDigit(c);
        if (digit < 0) return "its value has a character that is no hexadecimal digit";
        if (high < 0) {
            high = digit;
        } else {
            out->Put(static_cast<std::uint8_t>(high << 4 | digit));
            high = -1;
        }
    }
    return high < 0 ? nullptr : "its value has an odd number of hexadecimal digits";
}

// Blanks stand between groups of four digits, or anywhere else.
TextProblem DecodeBase64(std::string_view text, Output* out) {
    constexpr TextProblem kDamaged = "its value is no base64";
    std::uint32_t bits = 0;
    unsigned digits = 0;  // of the group
    unsigned fillers = 0;
    for (const char c : text) {
        if (IsBlank(c)) continue;
        if (digits + fillers == 4 && fillers > 0) return kDamaged;
        if (c == '=') {
            if (++fillers > 2 || digits + fillers > 4 || digits < 2) return kDamaged;
            continue;
        }
        const int digit = Base64Digit(c);
        if (digit < 0 || fillers > 0) return kDamaged;
        bits = bits << 6 | static_cast<std::uint32_t>(digit);
        if (++digits < 4) continue;
        for (const unsigned shift : {16U, 8U, 0U}) {
            out->Put(static_cast<std::uint8_t>(bits >> shift));
        }
        bits = 0;
        digits = 0;
    }
    if (digits == 0) return nullptr;
    if (digits + fillers != 4) return kDamaged;
    bits <<= 6 * fillers;
    out->Put(static_cast<std::uint8_t>(bits >> 16));
    if (fillers == 1) out->Put(static_cast<std::uint8_t>(bits >> 8));
    // Bits that belong to no byte are zeros.
    return (bits & (fillers == 1 ? 0xFFU : 0xFFFFU)) == 0 ? nullptr : kDamaged;
}

bool StartsEither(std::string_view text, std::string_view one, std::string_view other) {
    return text.starts_with(one) || text.starts_with(other);
}

}  // namespace

AttributeTextLine ParseAttributeTextLine(std::string_view line) {
    using Kind = AttributeTextLine::Kind;
    if (line.empty()) return {};
    if (line.starts_with(kObjectLine)) return {Kind::kObject, line.substr(kObjectLine.size()), {}};
    if (line.starts_with('#')) return {Kind::kComment, {}, {}};
    const std::size_t equals = line.find('=');
    if (equals == std::string_view::npos) return {Kind::kAttribute, line, {}};
    return {Kind::kAttribute, line.substr(0, equals), line.substr(equals + 1)};
}

DecodedText DecodeTextName(std::string_view text, ByteSpan to) {
    DecodedText decoded;
    Output out(to);
    while (!text.empty()) {
        auto byte = static_cast<std::uint8_t>(Take(&text));
        if (byte == '\\') {
            const auto escape = TakeOctal(&text, 3);
            if (!escape) {
                decoded.problem = "a backslash in it is not followed by three octal digits";
                return decoded;
            }
            byte = *escape;
        }
        if (byte == 0) {
            decoded.problem = kNulByte;
            return decoded;
        }
        out.Put(byte);
    }
    decoded.size = out.size();
    if (decoded.size == 0) decoded.problem = "it is empty";
    return decoded;
}

DecodedText DecodeTextValue(std::string_view text, ByteSpan to) {
    DecodedText decoded;
    Output out(to);
    if (text.find('\0') != std::string_view::npos) {
        decoded.problem = kNulByte;
    } else if (StartsEither(text, "0x", "0X")) {
        decoded.encoding = TextEncoding::kHex;
        decoded.problem = DecodeHex(text.substr(2), &out);
    } else if (StartsEither(text, "0s", "0S")) {
        decoded.encoding = TextEncoding::kBase64;
        decoded.problem = DecodeBase64(text.substr(2), &out);
    } else {
        decoded.problem = DecodeQuoted(text, &out);
    }
    decoded.size = out.size();
    return decoded;
}

bool IsWholeTextValue(std::string_view value) {
    return value.size() >= 2 && value.starts_with('"') && value.ends_with('"');
}

void TextChoice::Add(ByteView bytes) {
    if (bytes.empty()) return;
    size_ += bytes.size();
    unprintable_ += static_cast<std::uint64_t>(std::count_if(
        bytes.begin(), bytes.end(), [](std::uint8_t byte) { return byte < 0x20 || byte > 0x7E; }));
    ends_with_nul_ = bytes.back() == 0;
}

TextEncoding TextChoice::Best() const {
    constexpr std::uint64_t kMost = 8;  // one of so many bytes
    const bool readable = unprintable_ <= size_ / kMost && !ends_with_nul_;
    return readable ? TextEncoding::kText : TextEncoding::kBase64;
}

}  // namespace mavoea

#include "format/samba_stream.h"

#include <algorithm>

namespace mavoea {
namespace {

constexpr std::string_view kFirstPrefix = "user.DosStream.";
constexpr std::string_view kExtentPrefix = "user.DosStreamExt.";
constexpr std::string_view kSuffix = ":$DATA";

// U+F001 to U+F027 in UTF-8: these two bytes, and 0x80 and the low six bits.
constexpr std::string_view kPrivate = "\xEF\x80";
constexpr std::string_view kMapped = "\"*:<>?\\|";  // U+F020 to U+F027
constexpr unsigned kFirstMapped = 0x20;

// The low bits of the private character that stands for one; 0 where a plain one stands.
unsigned PrivateOf(char plain) {
    const auto code = static_cast<unsigned char>(plain);
    if (code < kFirstMapped) return code;
    const std::size_t mapped = kMapped.find(plain);
    if (mapped == std::string_view::npos) return 0;
    return kFirstMapped + static_cast<unsigned>(mapped);
}

// The plain character of a private one; NUL where there is none.
char PlainOf(char last_byte) {
    const unsigned low = static_cast<unsigned char>(last_byte) - 0x80U;
    if (low < kFirstMapped) return static_cast<char>(low);
    for (const char plain : kMapped) {
        if (PrivateOf(plain) == low) return plain;
    }
    return '\0';
}

bool TakePrefix(std::string_view prefix, std::string_view* text) {
    if (!text->starts_with(prefix)) return false;
    text->remove_prefix(prefix.size());
    return true;
}

// A number from 1 on as it is printed, and the '.' behind it.
bool TakeExtent(std::string_view* text, std::uint32_t* extent) {
    if (text->starts_with('0')) return false;
    std::size_t digits = 0;
    std::uint32_t number = 0;
    for (; digits < text->size() && (*text)[digits] >= '0' && (*text)[digits] <= '9'; ++digits) {
        if (digits == 3) return false;  // a value can tell of 255
        number = number * 10 + static_cast<std::uint32_t>((*text)[digits] - '0');
    }
    if (digits == 0 || digits == text->size() || (*text)[digits] != '.') return false;
    text->remove_prefix(digits + 1);
    *extent = number;
    return true;
}

}  // namespace

bool XattrName::Add(std::string_view text) {
    if (text.size() > bytes_.size() - size_) return false;
    std::copy(text.begin(), text.end(), bytes_.data() + size_);
    size_ += text.size();
    return true;
}

std::optional<StreamAttribute> DecodeStreamAttribute(std::string_view attribute) {
    std::string_view left = attribute;
    StreamAttribute stream;
    if (!TakePrefix(kFirstPrefix, &left) &&
        !(TakePrefix(kExtentPrefix, &left) && TakeExtent(&left, &stream.extent))) {
        return std::nullopt;
    }
    if (!left.ends_with(kSuffix) || left.size() == kSuffix.size()) return std::nullopt;
    while (left.size() > kSuffix.size()) {  // which stays, so that a byte is behind any two
        std::size_t size = 1;
        char plain = left.front();
        if (left.starts_with(kPrivate)) {
            if (const char mapped = PlainOf(left[kPrivate.size()]); mapped != '\0') {
                size = kPrivate.size() + 1;
                plain = mapped;
            }
        }
        if (!stream.name.Add({&plain, 1})) return std::nullopt;
        left.remove_prefix(size);
    }
    return stream;
}

std::optional<XattrName> EncodeStreamAttribute(std::string_view name) {
    XattrName attribute;
    if (name.empty() || !attribute.Add(kFirstPrefix)) return std::nullopt;
    for (const char plain : name) {
        if (plain == '\0' || plain == '/') return std::nullopt;
        const unsigned low = PrivateOf(plain);
        const char last_byte = low == 0 ? plain : static_cast<char>(0x80 + low);
        if (low != 0 && !attribute.Add(kPrivate)) return std::nullopt;
        if (!attribute.Add({&last_byte, 1})) return std::nullopt;
    }
    if (!attribute.Add(kSuffix)) return std::nullopt;
    return attribute;
}

std::optional<StreamValue> DecodeStreamValue(ByteView value) {
    if (value.empty()) return std::nullopt;
    return StreamValue{value.first(value.size() - 1), value.back()};
}

}  // namespace mavoea

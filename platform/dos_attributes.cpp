#include "platform/dos_attributes.h"

#include <algorithm>

namespace mavoea {
namespace {

using ByteView = std::span<const std::uint8_t>;
using ByteSpan = std::span<std::uint8_t>;

std::uint16_t LoadLe16(ByteView bytes, std::size_t at) {
    return static_cast<std::uint16_t>(bytes[at] | bytes[at + 1] << 8);
}
std::uint32_t LoadLe32(ByteView bytes, std::size_t at) {
    return LoadLe16(bytes, at) | std::uint32_t{LoadLe16(bytes, at + 2)} << 16;
}
std::uint64_t LoadLe64(ByteView bytes, std::size_t at) {
    return LoadLe32(bytes, at) | std::uint64_t{LoadLe32(bytes, at + 4)} << 32;
}
void StoreLe16(std::uint16_t value, ByteSpan bytes, std::size_t at) {
    bytes[at] = static_cast<std::uint8_t>(value);
    bytes[at + 1] = static_cast<std::uint8_t>(value >> 8);
}
void StoreLe32(std::uint32_t value, ByteSpan bytes, std::size_t at) {
    StoreLe16(static_cast<std::uint16_t>(value), bytes, at);
    StoreLe16(static_cast<std::uint16_t>(value >> 16), bytes, at + 2);
}
void StoreLe64(std::uint64_t value, ByteSpan bytes, std::size_t at) {
    StoreLe32(static_cast<std::uint32_t>(value), bytes, at);
    StoreLe32(static_cast<std::uint32_t>(value >> 32), bytes, at + 4);
}

// Where a version has its fields, from behind the two version numbers.
constexpr std::size_t kNone = SIZE_MAX;
struct Layout {
    std::size_t valid_flags;
    std::size_t attributes;
    std::size_t creation_time;
    std::size_t size;
};
constexpr Layout kLayouts[] = {
    {kNone, 0, 24, 40},     // 1
    {kNone, 4, kNone, 53},  // 2: a name is its end, of one NUL at least
    {0, 4, 28, 44},         // 3
    {0, 4, 16, 24},         // 4
    {0, 4, 8, 16},          // 5
};

struct Fields {
    const Layout* layout;
    std::size_t offset;  // of what the layout describes
};

std::size_t TextSize(ByteView bytes) {
    return static_cast<std::size_t>(std::find(bytes.begin(), bytes.end(), 0) - bytes.begin());
}

// Where the two version numbers are, behind the text's NUL, and what follows them.
std::size_t VersionsAt(ByteView bytes) { return (TextSize(bytes) + 2) & ~std::size_t{1}; }
std::size_t BodyAt(ByteView bytes) { return (VersionsAt(bytes) + 4 + 3) & ~std::size_t{3}; }

std::optional<Fields> FindFields(ByteView bytes) {
    const std::size_t versions = VersionsAt(bytes);
    if (bytes.size() < versions + 4) return std::nullopt;
    const std::uint16_t version = LoadLe16(bytes, versions);
    if (version < 1 || version > std::size(kLayouts)) return std::nullopt;
    if (LoadLe16(bytes, versions + 2) != version) return std::nullopt;
    const Layout& layout = kLayouts[version - 1];
    const std::size_t offset = BodyAt(bytes);
    if (bytes.size() < offset + layout.size) return std::nullopt;
    return Fields{&layout, offset};
}

int HexDigit(std::uint8_t c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// "0x22" or "22", with or without a NUL. What stands behind the digits is ignored, as Samba does.
std::optional<std::uint32_t> DecodeText(ByteView bytes) {
    const auto end = std::find(bytes.begin(), bytes.end(), 0);
    if (end != bytes.end() && end + 1 != bytes.end()) return std::nullopt;
    auto at = bytes.begin();
    if (end - at > 2 && at[0] == '0' && (at[1] == 'x' || at[1] == 'X')) at += 2;
    std::uint64_t value = 0;
    const auto digits = at;
    for (; at != end && HexDigit(*at) >= 0; ++at) {
        value = value << 4 | static_cast<unsigned>(HexDigit(*at));
        if (value > UINT32_MAX) return std::nullopt;
    }
    if (at == digits) return std::nullopt;
    return static_cast<std::uint32_t>(value);
}

}  // namespace

DosAttributesFields ReadDosAttributesFields(ByteView bytes) {
    DosAttributesFields fields;
    fields.text = {reinterpret_cast<const char*>(bytes.data()), TextSize(bytes)};
    const std::size_t versions = VersionsAt(bytes);
    if (bytes.size() < versions + 2) return fields;
    fields.version = LoadLe16(bytes, versions);
    if (bytes.size() < versions + 4) return fields;
    fields.version_again = LoadLe16(bytes, versions + 2);
    if (*fields.version < 1 || *fields.version > std::size(kLayouts)) return fields;
    const Layout& layout = kLayouts[*fields.version - 1];
    const std::size_t offset = BodyAt(bytes);
    fields.size = offset + layout.size;
    const auto has = [&](std::size_t at, std::size_t size) {
        return at != kNone && offset + at + size <= bytes.size();
    };
    if (has(layout.valid_flags, 4)) {
        fields.valid_flags = LoadLe32(bytes, offset + layout.valid_flags);
    }
    if (has(layout.attributes, 4)) fields.attributes = LoadLe32(bytes, offset + layout.attributes);
    if (has(layout.creation_time, 8)) {
        fields.creation_time = LoadLe64(bytes, offset + layout.creation_time);
    }
    return fields;
}

std::optional<DosAttributes> DecodeDosAttributes(ByteView bytes) {
    if (bytes.size() > kDosAttributesMax) return std::nullopt;
    const auto fields = FindFields(bytes);
    if (!fields) {
        const auto attributes = DecodeText(bytes);
        if (!attributes) return std::nullopt;
        return DosAttributes{.attributes = *attributes, .creation_time = {}};
    }
    const auto [layout, offset] = *fields;
    DosAttributes value{.attributes = LoadLe32(bytes, offset + layout->attributes),
                        .creation_time = {}};
    if (layout->creation_time == kNone) return value;
    if (layout->valid_flags != kNone &&
        (LoadLe32(bytes, offset + layout->valid_flags) & kDosCreationTimeValid) == 0) {
        return value;
    }
    const std::uint64_t time = LoadLe64(bytes, offset + layout->creation_time);
    if (time != 0) value.creation_time = time;
    return value;
}

bool SetDosAttributes(ByteSpan bytes, std::uint32_t attributes) {
    const auto fields = FindFields(bytes);
    if (!fields) return false;
    const auto [layout, offset] = *fields;
    StoreLe32(attributes, bytes, offset + layout->attributes);
    if (layout->valid_flags != kNone) {
        const std::size_t at = offset + layout->valid_flags;
        StoreLe32(LoadLe32(bytes, at) | kDosAttributesValid, bytes, at);
    }
    return true;
}

std::array<std::uint8_t, kDosAttributesSize> EncodeDosAttributes(const DosAttributes& value) {
    constexpr std::size_t kVersion = 2;  // behind the empty text and a byte of padding
    constexpr std::size_t kBody = 8;
    constexpr const Layout& kLayout = kLayouts[4];
    static_assert(kBody + kLayout.size == kDosAttributesSize);

    std::array<std::uint8_t, kDosAttributesSize> bytes{};
    StoreLe16(5, bytes, kVersion);
    StoreLe16(5, bytes, kVersion + 2);
    StoreLe32(kDosAttributesValid | (value.creation_time ? kDosCreationTimeValid : 0), bytes,
              kBody + kLayout.valid_flags);
    StoreLe32(value.attributes, bytes, kBody + kLayout.attributes);
    StoreLe64(value.creation_time.value_or(0), bytes, kBody + kLayout.creation_time);
    return bytes;
}

}  // namespace mavoea

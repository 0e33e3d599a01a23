// Names for FAT: characters that it reserves are kept in Unicode's private-use area, at the places
// where Services for Macintosh put them and NTFS, SMB clients and Samba's catia look for them.

#include <errno.h>
#include <string.h>

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "platform/include/mavocore.h"

namespace {

// Reserved characters above the control characters: the first is U+F020.
constexpr std::string_view kReserved = "\"*:<>?\\|";

constexpr std::size_t kUtf8Size = 3;

// What to add to U+F000, 0 for a character that stays.
constexpr unsigned PrivateUseIndex(char c) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte < 0x20) return byte;
    const std::size_t at = kReserved.find(c);
    return at == std::string_view::npos ? 0 : 0x20 + static_cast<unsigned>(at);
}

static_assert(PrivateUseIndex('"') == 0x20 && PrivateUseIndex('|') == 0x27);
static_assert(PrivateUseIndex('\x1f') == 0x1F && PrivateUseIndex('a') == 0);

// Where the last component begins. Slashes behind it do not count.
constexpr std::size_t LastComponent(std::string_view path) {
    while (!path.empty() && path.back() == '/') path.remove_suffix(1);
    return path.rfind('/') + 1;  // npos + 1 is 0
}

static_assert(LastComponent("/v/a") == 3 && LastComponent("/v/a//") == 3);
static_assert(LastComponent("a") == 0 && LastComponent("/") == 0);

}  // namespace

int MAVOStrReplaceFATReservedChar(const char* szIn, char* szOut, int cbOut) {
    if (szIn == nullptr || szOut == nullptr) {
        errno = EINVAL;
        return -1;
    }
    const std::string_view in = szIn;
    const std::size_t begin = LastComponent(in);
    const std::string_view name(in.data() + begin, in.size() - begin);

    // Measured before anything is written.
    std::uint64_t size = in.size() + std::uint64_t{1};
    for (char c : name) {
        if (PrivateUseIndex(c) != 0) size += kUtf8Size - 1;
    }
    if (cbOut <= 0 || size > static_cast<unsigned>(cbOut)) {
        errno = ENAMETOOLONG;
        return -1;
    }

    memcpy(szOut, in.data(), begin);
    char* out = szOut + begin;
    for (char c : name) {
        const unsigned index = PrivateUseIndex(c);
        if (index == 0) {
            *out++ = c;
            continue;
        }
        // U+F000 + index, index below 0x40, in UTF-8.
        *out++ = static_cast<char>(0xEF);
        *out++ = static_cast<char>(0x80);
        *out++ = static_cast<char>(0x80 | index);
    }
    *out = '\0';
    return 0;
}

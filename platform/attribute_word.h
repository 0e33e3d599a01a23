// How a host keeps a file's attribute word (MLIBC_ATTRIBUTE_...): the extended attribute kName,
// 4 bytes, big-endian. A value of any other size counts as no word at all.
//
// What Samba's clients may change, kSharedBits, is in the file's DOS attributes as well where it
// has some, as on a share: what they say counts. Nobody gives them to a file that has none.
//
// Shared by the library's host marks, by libmavocore's MLIBCFileStat() and by the tool.
#ifndef MAVOEA_PLATFORM_ATTRIBUTE_WORD_H_
#define MAVOEA_PLATFORM_ATTRIBUTE_WORD_H_

#include <errno.h>
#include <sys/types.h>

#include <cstdint>

#include "platform/dos_attributes.h"
#include "platform/include/mavocore.h"

namespace mavoea::attribute_word {

inline constexpr char kName[] = "user.mavo.attributes";
inline constexpr int kSize = 4;

inline constexpr unsigned kSharedBits = MLIBC_ATTRIBUTE_ARCHIVE | MLIBC_ATTRIBUTE_HIDDEN;

// `size` is what getxattr returned for `bytes`, negative included.
constexpr unsigned Decode(const unsigned char bytes[kSize], ssize_t size) {
    if (size != kSize) return 0;
    return unsigned{bytes[0]} << 24 | unsigned{bytes[1]} << 16 | unsigned{bytes[2]} << 8 | bytes[3];
}

constexpr void Encode(unsigned word, unsigned char bytes[kSize]) {
    for (int i = 0; i < kSize; ++i) {
        bytes[i] = static_cast<unsigned char>(word >> (8 * (kSize - 1 - i)));
    }
}

// Errors of getxattr() that mean that the file has no such attribute, or one that counts as none,
// on a file system that has them.
constexpr bool MeansNone(int error) { return error == ENODATA || error == ERANGE; }

// The shared bits, among others, as DOS attributes.
constexpr std::uint32_t ToDos(unsigned bits) {
    return ((bits & MLIBC_ATTRIBUTE_ARCHIVE) != 0 ? kDosArchive : 0) |
           ((bits & MLIBC_ATTRIBUTE_HIDDEN) != 0 ? kDosHidden : 0);
}

// The word of a file that has DOS attributes, too.
constexpr unsigned WithDos(unsigned word, std::uint32_t dos_attributes) {
    return (word & ~kSharedBits) |
           ((dos_attributes & kDosArchive) != 0 ? unsigned{MLIBC_ATTRIBUTE_ARCHIVE} : 0) |
           ((dos_attributes & kDosHidden) != 0 ? unsigned{MLIBC_ATTRIBUTE_HIDDEN} : 0);
}

}  // namespace mavoea::attribute_word

#endif  // MAVOEA_PLATFORM_ATTRIBUTE_WORD_H_

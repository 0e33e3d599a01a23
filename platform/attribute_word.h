// How a host keeps a file's attribute word (MLIBC_ATTRIBUTE_...): the extended attribute kName,
// 4 bytes, big-endian. A value of any other size counts as no word at all.
//
// Shared by the library's host marks and by libmavocore's MLIBCFileStat().
#ifndef MAVOEA_PLATFORM_ATTRIBUTE_WORD_H_
#define MAVOEA_PLATFORM_ATTRIBUTE_WORD_H_

#include <sys/types.h>

namespace mavoea::attribute_word {

inline constexpr char kName[] = "user.mavo.attributes";
inline constexpr int kSize = 4;

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

}  // namespace mavoea::attribute_word

#endif  // MAVOEA_PLATFORM_ATTRIBUTE_WORD_H_

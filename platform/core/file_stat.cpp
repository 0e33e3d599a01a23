// Extended stat: the mode, and the attribute word where a host keeps it.

#include <errno.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <cstddef>
#include <cstdint>

#include "platform/attribute_word.h"
#include "platform/include/mavocore.h"

namespace {

//   offset  size  field, in host order; all other bytes are 0
//       16     4  mode, as st_mode
//      116     4  attribute word
constexpr std::size_t kInfoSize = 128;
constexpr std::size_t kModeOffset = 16;
constexpr std::size_t kAttributeOffset = 116;

// Errors of getxattr() that mean that the file has no attribute word, or one of another size.
bool MeansNoWord(int error) {
    return error == ENODATA || error == ENOTSUP || error == ENOSYS || error == ERANGE;
}

}  // namespace

int MLIBCFileStat(const char* szPath, int /*option*/, void* pInfo) {
    if (szPath == nullptr || pInfo == nullptr) {
        errno = EINVAL;
        return -1;
    }
    const int saved = errno;
    struct stat status;
    if (stat(szPath, &status) != 0) return -1;

    namespace word = mavoea::attribute_word;
    unsigned char bytes[word::kSize];
    const ssize_t size = getxattr(szPath, word::kName, bytes, sizeof bytes);
    if (size < 0 && !MeansNoWord(errno)) return -1;
    errno = saved;

    const std::uint32_t mode = status.st_mode;
    const std::uint32_t attributes = word::Decode(bytes, size);
    auto* const info = static_cast<unsigned char*>(pInfo);
    memset(info, 0, kInfoSize);
    memcpy(info + kModeOffset, &mode, sizeof mode);
    memcpy(info + kAttributeOffset, &attributes, sizeof attributes);
    return 0;
}

// Extended stat: the mode, and the attribute word where a host keeps it.

#include <errno.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include "platform/attribute_word.h"
#include "platform/file_status.h"
#include "platform/include/mavocore.h"

namespace {

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

    mavoea::EncodeFileStatus({.mode = status.st_mode, .attributes = word::Decode(bytes, size)},
                             static_cast<unsigned char*>(pInfo));
    return 0;
}

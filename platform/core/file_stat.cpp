// Extended stat: the mode, and the attribute word where a host keeps it.

#include <errno.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include "platform/attribute_word.h"
#include "platform/dos_attributes.h"
#include "platform/file_status.h"
#include "platform/include/mavocore.h"

namespace {

namespace word = mavoea::attribute_word;

// False with errno. Where there are no attributes of users the first answer says so.
bool ReadWord(const char* path, unsigned* attributes) {
    unsigned char bytes[word::kSize];
    const ssize_t size = getxattr(path, word::kName, bytes, sizeof bytes);
    *attributes = word::Decode(bytes, size);
    if (size < 0 && !word::MeansNone(errno)) return errno == ENOTSUP || errno == ENOSYS;

    unsigned char dos_bytes[mavoea::kDosAttributesMax];
    const ssize_t dos_size =
        getxattr(path, mavoea::kDosAttributesName, dos_bytes, sizeof dos_bytes);
    if (dos_size < 0) return word::MeansNone(errno);
    const auto dos = mavoea::DecodeDosAttributes({dos_bytes, static_cast<std::size_t>(dos_size)});
    if (dos) *attributes = word::WithDos(*attributes, dos->attributes);
    return true;
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

    unsigned attributes;
    if (!ReadWord(szPath, &attributes)) return -1;
    errno = saved;

    mavoea::EncodeFileStatus({.mode = status.st_mode, .attributes = attributes},
                             static_cast<unsigned char*>(pInfo));
    return 0;
}

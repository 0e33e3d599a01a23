// The marks on a kernel that does not know the platform's calls: an extended attribute of the file,
// which libmavocore's MLIBCFileStat() shows in the attribute word.

#include <errno.h>
#include <fcntl.h>
#include <sys/xattr.h>

#include "platform/attribute_word.h"
#include "platform/include/mavocore.h"
#include "platform/marks.h"

namespace mavoea::marks {

int SetArchiveBit(int fd) {
    const int result = ::fcntl(fd, kSetArchive);
    if (result >= 0 || errno != EINVAL) return result;

    unsigned char bytes[attribute_word::kSize];
    const ssize_t size = ::fgetxattr(fd, attribute_word::kName, bytes, sizeof bytes);
    if (size < 0 && errno != ENODATA && errno != ERANGE) return -1;
    const unsigned word = attribute_word::Decode(bytes, size) | MLIBC_ATTRIBUTE_ARCHIVE;
    attribute_word::Encode(word, bytes);
    return ::fsetxattr(fd, attribute_word::kName, bytes, sizeof bytes, 0);
}

}  // namespace mavoea::marks

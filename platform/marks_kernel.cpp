// The marks of the platform's kernel: the raw calls only.

#include <fcntl.h>
#include <unistd.h>

#include "platform/descriptors.h"
#include "platform/marks.h"

namespace mavoea::marks {

int SetArchiveBit(int fd) { return ::fcntl(fd, kSetArchive); }

int SetArchiveBit(const char* path) {
    const int fd = OpenToMark(path);
    if (fd < 0) return -1;
    const int result = SetArchiveBit(fd);
    CloseQuietly(fd);
    return result;
}

int FileCommand(const char* path, int command) {
    return static_cast<int>(::syscall(kFileCommandCall, path, command));
}

}  // namespace mavoea::marks

// The marks of the platform's kernel: the raw calls only.

#include <fcntl.h>
#include <unistd.h>

#include "platform/marks.h"

namespace mavoea::marks {

int SetArchiveBit(int fd) { return ::fcntl(fd, kSetArchive); }

int FileCommand(const char* path, int command) {
    return static_cast<int>(::syscall(kFileCommandCall, path, command));
}

}  // namespace mavoea::marks

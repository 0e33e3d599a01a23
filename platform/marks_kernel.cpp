// The marks of the platform's kernel: the raw calls only.

#include <fcntl.h>

#include "platform/marks.h"

namespace mavoea::marks {

int SetArchiveBit(int fd) { return ::fcntl(fd, kSetArchive); }

}  // namespace mavoea::marks

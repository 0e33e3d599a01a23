// The SMB archive bit, which tells backups that a file has changed.

#include "include/mavoea.h"
#include "util/owned.h"

using namespace mavoea;

int EASetSmbArchive(const char* szPath) {
    if (szPath == nullptr) {
        errno = EFAULT;
        return -1;
    }
    // A FIFO without a writer must not hold the caller up.
    const UniqueFd fd(kernel::Open(szPath, O_RDONLY | O_NONBLOCK | O_CLOEXEC, 0));
    return fd ? kernel::SetArchiveBit(fd.get()) : -1;
}

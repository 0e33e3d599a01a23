// The SMB archive bit, which tells backups that a file has changed.

#include <errno.h>

#include "include/mavoea.h"
#include "platform/kernel.h"

using namespace mavoea;

int EASetSmbArchive(const char* szPath) {
    if (szPath == nullptr) {
        errno = EFAULT;
        return -1;
    }
    return kernel::SetArchiveBit(szPath);
}

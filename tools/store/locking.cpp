#include "tools/store/locking.h"

#include <fcntl.h>

#include "include/mavoea.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

void LockFile(const File& file, Access access) {
    EASHandle holder{};
    holder.fd = file.fd();
    holder.lockType = F_UNLCK;
    const ErrorMark mark;
    if (MAVOEASLockSet(&holder, access == Access::kRead ? F_RDLCK : F_WRLCK) != 0) {
        throw LibraryFailure(file.path(), mark.Get());
    }
}

}  // namespace mavoea::tool

// Opens a stream anew after a write that failed.

#include <fcntl.h>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "util/unit.h"

namespace mavoea {

EASHandle* EASReopen(EASHandle* h) {
    if (h == nullptr) return nullptr;
    const ErrnoKeeper keep;
    const int fd = h->fd;
    (void)MAVOEASClose(h);
    return MAVOEASOpen(fd, F_WRLCK);
}

}  // namespace mavoea

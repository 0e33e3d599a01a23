#include "util/metadata_file.h"

#include <errno.h>

#include "platform/descriptors.h"
#include "util/owned.h"

namespace mavoea {

void SetMetadataMode(const char* path, mode_t mode) {
    const ErrnoKeeper keep;
    UniqueFd fd(kernel::OpenRegular(path, O_RDONLY | O_CLOEXEC, 0));
    if (!fd) fd.Reset(kernel::OpenRegular(path, O_WRONLY | O_CLOEXEC, 0));
    if (fd) (void)kernel::Fchmod(fd.get(), mode);
}

bool IsMetadataOrMissing(const char* path) {
    struct stat info;
    if (kernel::Lstat(path, &info) != 0) return errno == ENOENT;
    const int refusal = RefusalOf(info.st_mode & S_IFMT);
    if (refusal != 0) errno = refusal;
    return refusal == 0;
}

}  // namespace mavoea

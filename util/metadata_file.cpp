#include "util/metadata_file.h"

#include <errno.h>

#include "platform/descriptors.h"
#include "util/owned.h"

namespace mavoea {

int OpenOrMake(const char* path, bool* made) {
    *made = false;
    constexpr int kFlags = O_RDWR | O_CLOEXEC;
    constexpr mode_t kMode = 0777;
    for (int tries = kOpenTries;; --tries) {
        int fd = kernel::OpenRegular(path, kFlags, kMode);
        if (fd >= 0 || errno != ENOENT || tries == 0) return fd;
        fd = kernel::OpenRegular(path, kFlags | O_CREAT | O_EXCL, kMode);
        *made = fd >= 0;
        if (fd >= 0 || errno != EEXIST) return fd;
    }
}

bool Names(const char* path, int fd) {
    struct stat opened;
    struct stat named;
    if (kernel::Fstat(fd, &opened) != 0 || kernel::Lstat(path, &named) != 0) return false;
    if (SameFile(opened, named)) return true;
    errno = ESTALE;
    return false;
}

bool HasMetadataMode(const char* path, mode_t mode) {
    const ErrnoKeeper keep;
    struct stat info;
    return kernel::Lstat(path, &info) == 0 && info.st_mode == (S_IFREG | mode);
}

void SetMetadataMode(const char* path, mode_t mode) {
    const ErrnoKeeper keep;
    UniqueFd fd(kernel::OpenToRead(path));
    if (!fd) fd.Reset(kernel::OpenRegular(path, O_WRONLY | O_CLOEXEC, 0));
    if (fd) (void)kernel::Fchmod(fd.get(), mode);
}

Found LookAt(const char* path) {
    struct stat info;
    if (kernel::Lstat(path, &info) != 0) {
        return errno == ENOENT ? Found::kNothing : Found::kOther;
    }
    const int refusal = RefusalOf(info.st_mode & S_IFMT);
    if (refusal == 0) return Found::kFile;
    errno = refusal;
    return Found::kOther;
}

}  // namespace mavoea

// Opening what lies in folders where everybody may put something else in its place: links are not
// followed, and nobody is waited for.
#ifndef MAVOEA_PLATFORM_DESCRIPTORS_H_
#define MAVOEA_PLATFORM_DESCRIPTORS_H_

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace mavoea {

// What opening a file of that kind (the S_IFMT bits of its mode) as a regular one fails with; 0 for
// one that is.
inline int RefusalOf(mode_t kind) {
    switch (kind) {
        case S_IFREG:
            return 0;
        case S_IFLNK:
            return ELOOP;
        case S_IFDIR:
            return EISDIR;
        default:
            return ENXIO;
    }
}

// Closes `fd`; errno stays.
inline void CloseQuietly(int fd) {
    const int error = errno;
    (void)::close(fd);
    errno = error;
}

// The kind of the file behind `fd`, -1 with errno when it cannot be told. A look at its times would
// make the next write renew them, and the next sync write them: half as much again for a small
// file.
inline int KindOf(int fd, mode_t* kind) {
#ifdef STATX_TYPE
    struct statx details;
    if (::statx(fd, "", AT_EMPTY_PATH, STATX_TYPE, &details) == 0) {
        *kind = details.stx_mode & S_IFMT;
        return 0;
    }
    if (errno != ENOSYS) return -1;
#endif
    struct stat info;
    if (::fstat(fd, &info) != 0) return -1;
    *kind = info.st_mode & S_IFMT;
    return 0;
}

constexpr int kRegularFileFlags = O_NOFOLLOW | O_NONBLOCK;

// open(2), with kRegularFileFlags added, of a regular file. For anything else -1 with errno ELOOP
// (a symbolic link), EISDIR or ENXIO.
inline int OpenRegularFile(const char* path, int flags, mode_t mode) {
    const int fd = ::open(path, flags | kRegularFileFlags, mode);
    if (fd < 0) return -1;
    mode_t kind = 0;
    const int refusal = KindOf(fd, &kind) == 0 ? RefusalOf(kind) : errno;
    if (refusal == 0) return fd;
    errno = refusal;
    CloseQuietly(fd);
    return -1;
}

// opendir(3); a symbolic link in the directory's place is ENOTDIR.
inline DIR* OpenDirectoryItself(const char* path) {
    const int fd = ::open(path, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) return nullptr;
    DIR* const dir = ::fdopendir(fd);
    if (dir == nullptr) CloseQuietly(fd);
    return dir;
}

}  // namespace mavoea

#endif  // MAVOEA_PLATFORM_DESCRIPTORS_H_

// Opening what lies in folders where everybody may put something else in its place: links are not
// followed, and nobody is waited for.
#ifndef MAVOEA_PLATFORM_DESCRIPTORS_H_
#define MAVOEA_PLATFORM_DESCRIPTORS_H_

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
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
    // Kernels that do not know it, and sandboxes, refuse it each in a way of its own.
#endif
    struct stat info;
    if (::fstat(fd, &info) != 0) return -1;
    *kind = info.st_mode & S_IFMT;
    return 0;
}

// Whether an open with these flags makes the file that it opens: it waits for nobody, and needs no
// look at what it is.
constexpr bool MakesFile(int flags) { return (flags & O_CREAT) != 0 && (flags & O_EXCL) != 0; }

// What open(2) is asked with to open a regular file. Somebody may have put a pipe in its place, and
// there is no look beforehand that another pipe could not come after; O_NONBLOCK keeps an open for
// reading or for writing from waiting for the other end. One for both does not wait for it, so that
// the usual way to open a file to be written needs no further call that takes the flag off again.
// (A device may wait even so; only the superuser makes those.)
constexpr int RegularFileFlags(int flags) {
    const bool may_wait = (flags & O_ACCMODE) != O_RDWR && !MakesFile(flags);
    return flags | O_NOFOLLOW | (may_wait ? O_NONBLOCK : 0);
}

// Opens a regular file that somebody has a lease on, as open(2) does: it waits until the lease is
// given up, or taken away. That is done by what a descriptor holds which opens nothing itself, so
// that no pipe can come between. Where there is no /proc, EWOULDBLOCK.
inline int OpenLeasedFile(const char* path, int flags) {
    const int place = ::open(path, O_PATH | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
    if (place < 0) return -1;
    int fd = -1;
    mode_t kind = 0;
    const int refusal = KindOf(place, &kind) == 0 ? RefusalOf(kind) : errno;
    if (refusal == 0) {
        char held[32];
        (void)::snprintf(held, sizeof held, "/proc/self/fd/%d", place);
        fd = ::open(held, flags & ~(O_NOFOLLOW | O_CREAT));
        if (fd < 0 && errno == ENOENT) errno = EWOULDBLOCK;
    } else {
        errno = refusal;
    }
    CloseQuietly(place);
    return fd;
}

// open(2) of a regular file; links are not followed. For anything else -1 with errno ELOOP (a
// symbolic link), EISDIR or ENXIO, at once. The descriptor has the flags that were asked for.
inline int OpenRegularFile(const char* path, int flags, mode_t mode) {
    const int asked = RegularFileFlags(flags);
    const bool guarded = ((asked & ~flags) & O_NONBLOCK) != 0;
    const int fd = ::open(path, asked, mode);
    if (fd < 0 && guarded && errno == EWOULDBLOCK) return OpenLeasedFile(path, flags);
    if (fd < 0 || MakesFile(flags)) return fd;
    mode_t kind = 0;
    int refusal = KindOf(fd, &kind) == 0 ? RefusalOf(kind) : errno;
    if (refusal == 0 && guarded && ::fcntl(fd, F_SETFL, flags) != 0) refusal = errno;
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

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

// What an open file is.
struct OpenFile {
    mode_t kind = 0;              // the S_IFMT bits of its mode
    unsigned long long size = 0;  // in bytes
};

// 0, or -1 with errno when it cannot be told. A look at its times would make the next write renew
// them, and the next sync write them: half as much again for a small file.
inline int LookAtOpen(int fd, OpenFile* file) {
#ifdef STATX_TYPE
    struct statx details;
    if (::statx(fd, "", AT_EMPTY_PATH, STATX_TYPE | STATX_SIZE, &details) == 0) {
        *file = {static_cast<mode_t>(details.stx_mode & S_IFMT), details.stx_size};
        return 0;
    }
    // Kernels that do not know it, and sandboxes, refuse it each in a way of its own.
#endif
    struct stat info;
    if (::fstat(fd, &info) != 0) return -1;
    *file = {info.st_mode & S_IFMT, static_cast<unsigned long long>(info.st_size)};
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

// For what is read and closed again.
inline constexpr int kReadFlags = O_RDONLY | O_CLOEXEC;

// Opens a regular file that somebody has a lease on, as open(2) does: it waits until the lease is
// given up, or taken away. That is done by what a descriptor holds which opens nothing itself, so
// that no pipe can come between. Where there is no /proc, EWOULDBLOCK.
inline int OpenLeasedFile(const char* path, int flags) {
    const int place = ::open(path, O_PATH | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
    if (place < 0) return -1;
    int fd = -1;
    OpenFile file;
    const int refusal = LookAtOpen(place, &file) == 0 ? RefusalOf(file.kind) : errno;
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

// Opens a regular file as RegularFileFlags() says, and looks what it is (of a file that it makes it
// is known). -1 with errno ELOOP for a symbolic link, EISDIR or ENXIO for other things, at once.
inline int OpenGuarded(const char* path, int flags, mode_t mode, OpenFile* file) {
    int fd = ::open(path, RegularFileFlags(flags), mode);
    if (fd < 0 && errno == EWOULDBLOCK && (flags & O_NONBLOCK) == 0) {
        fd = OpenLeasedFile(path, flags);
    }
    if (fd < 0 || MakesFile(flags)) return fd;
    const int refusal = LookAtOpen(fd, file) == 0 ? RefusalOf(file->kind) : errno;
    if (refusal == 0) return fd;
    errno = refusal;
    CloseQuietly(fd);
    return -1;
}

// open(2) of a regular file; links are not followed. For anything else as OpenGuarded(). The
// descriptor has the flags that were asked for.
inline int OpenRegularFile(const char* path, int flags, mode_t mode) {
    OpenFile file;
    const int fd = OpenGuarded(path, flags, mode, &file);
    const bool guarded = ((RegularFileFlags(flags) & ~flags) & O_NONBLOCK) != 0;
    if (fd < 0 || !guarded || ::fcntl(fd, F_SETFL, flags) == 0) return fd;
    CloseQuietly(fd);
    return -1;
}

// The same for reading that is over before anybody else has the descriptor: O_NONBLOCK, which says
// nothing to a regular file, stays on. *size becomes the file's, in bytes, unless it is nullptr.
inline int OpenRegularFileToRead(const char* path, unsigned long long* size) {
    OpenFile file;
    const int fd = OpenGuarded(path, kReadFlags, 0, &file);
    if (size != nullptr) *size = file.size;
    return fd;
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

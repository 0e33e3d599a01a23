// The kernel seam that ships: each call goes straight through.

#include "platform/kernel.h"

#include <errno.h>
#include <stdlib.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <utility>

#include "platform/descriptors.h"
#include "platform/marks.h"

namespace mavoea::kernel {

int Open(const char* path, int flags, mode_t mode) { return ::open(path, flags, mode); }
int OpenRegular(const char* path, int flags, mode_t mode) {
    return OpenRegularFile(path, flags, mode);
}
int OpenToRead(const char* path, unsigned long long* size) {
    return OpenRegularFileToRead(path, size);
}
int OpenAt(int dir, const char* path, int flags, mode_t mode) {
    return ::openat(dir, path, flags, mode);
}
int Close(int fd) { return ::close(fd); }
ssize_t Pread(int fd, void* buffer, size_t size, off_t offset) {
    return ::pread(fd, buffer, size, offset);
}
ssize_t Preadv(int fd, const iovec* parts, int count, off_t offset) {
    return ::preadv(fd, parts, count, offset);
}
ssize_t Pwrite(int fd, const void* bytes, size_t size, off_t offset) {
    return ::pwrite(fd, bytes, size, offset);
}
ssize_t Pwritev(int fd, const iovec* parts, int count, off_t offset) {
    return ::pwritev(fd, parts, count, offset);
}
off_t Lseek(int fd, off_t offset, int whence) { return ::lseek(fd, offset, whence); }
int Ftruncate(int fd, off_t size) { return ::ftruncate(fd, size); }
int Reserve(int fd, off_t offset, off_t size) {
    return ::fallocate(fd, FALLOC_FL_KEEP_SIZE, offset, size);
}
int Fsync(int fd) { return ::fsync(fd); }
void Sync() { ::sync(); }
int Fstat(int fd, struct stat* info) { return ::fstat(fd, info); }
int Stat(const char* path, struct stat* info) { return ::stat(path, info); }
int Lstat(const char* path, struct stat* info) { return ::lstat(path, info); }
int FstatAt(int dir, const char* path, struct stat* info, int flags) {
    return ::fstatat(dir, path, info, flags);
}
int Access(const char* path, int mode) { return ::access(path, mode); }
int SetLock(int fd, const struct flock64* lock) { return ::fcntl(fd, F_SETLK64, lock); }
int GetLock(int fd, struct flock64* lock) { return ::fcntl(fd, F_GETLK64, lock); }

int MkdirAt(int dir, const char* path, mode_t mode) {
    return dir == AT_FDCWD ? ::mkdir(path, mode) : ::mkdirat(dir, path, mode);
}
int Link(const char* from, const char* to, int flags) {
    return ::linkat(AT_FDCWD, from, AT_FDCWD, to, flags);
}
int Unlink(const char* path) { return ::unlink(path); }
int UnlinkAt(int dir, const char* path, int flags) { return ::unlinkat(dir, path, flags); }
int Rmdir(const char* path) { return ::rmdir(path); }
int Remove(const char* path) { return ::remove(path); }
int Rename(const char* from, const char* to) { return ::rename(from, to); }
int RenameAt(int from_dir, const char* from, int to_dir, const char* to) {
    return ::renameat(from_dir, from, to_dir, to);
}
int Chmod(const char* path, mode_t mode) { return ::chmod(path, mode); }
int Fchmod(int fd, mode_t mode) { return ::fchmod(fd, mode); }

char* Getcwd(char* buffer, size_t size) { return ::getcwd(buffer, size); }
DIR* Opendir(const char* path) { return ::opendir(path); }
DIR* OpendirItself(const char* path) { return OpenDirectoryItself(path); }
dirent* Readdir(DIR* dir) { return ::readdir(dir); }
void Rewinddir(DIR* dir) { ::rewinddir(dir); }
int Dirfd(DIR* dir) { return ::dirfd(dir); }
int Closedir(DIR* dir) { return ::closedir(dir); }

uid_t Geteuid() { return ::geteuid(); }
int Seteuid(uid_t uid) { return ::seteuid(uid); }
pid_t Getpid() { return ::getpid(); }
time_t Time() { return ::time(nullptr); }
// NOLINTNEXTLINE(cert-env33-c): callers quote what they pass on.
int System(const char* command) { return ::system(command); }

// The attr package's path-following calls; its libattr only forwards to the C library's.
ssize_t Listxattr(const char* path, char* names, size_t size) {
    return ::listxattr(path, names, size);
}
ssize_t Getxattr(const char* path, const char* name, void* value, size_t size) {
    return ::getxattr(path, name, value, size);
}
int Setxattr(const char* path, const char* name, const void* value, size_t size, int flags) {
    return ::setxattr(path, name, value, size, flags);
}
int Removexattr(const char* path, const char* name) { return ::removexattr(path, name); }

FILE* Fopen(const char* path, const char* mode) { return ::fopen(path, mode); }
size_t Fread(void* buffer, size_t size, FILE* stream) { return ::fread(buffer, 1, size, stream); }
size_t Fwrite(const void* bytes, size_t size, FILE* stream) {
    return ::fwrite(bytes, 1, size, stream);
}
int Fclose(FILE* stream) { return ::fclose(stream); }

int SetArchiveBit(int fd) { return marks::SetArchiveBit(fd); }
int SetArchiveBit(const char* path) { return marks::SetArchiveBit(path); }
int FileCommand(const char* path, int command) { return marks::FileCommand(path, command); }

void* Allocate(unsigned long long size) {
    if (!std::in_range<size_t>(size)) {
        errno = ENOMEM;
        return nullptr;
    }
    return ::malloc(static_cast<size_t>(size));
}

void* AllocateZeroed(unsigned long long size) {
    if (!std::in_range<size_t>(size)) {
        errno = ENOMEM;
        return nullptr;
    }
    return ::calloc(1, static_cast<size_t>(size));
}

void* Reallocate(void* block, unsigned long long size) {
    if (!std::in_range<size_t>(size)) {
        errno = ENOMEM;
        return nullptr;
    }
    return ::realloc(block, static_cast<size_t>(size));
}

void Free(void* block) { ::free(block); }

}  // namespace mavoea::kernel

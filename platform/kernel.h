// Every call that the library makes to the kernel and to the C library's files and heap.
//
// One declaration per call, so that a test can link a version that counts the calls, fails the
// nth of them or stands in for a filesystem. kernel.cpp is the one that ships: it calls straight
// through. Results and errno are those of the calls.
#ifndef MAVOEA_PLATFORM_KERNEL_H_
#define MAVOEA_PLATFORM_KERNEL_H_

#include <dirent.h>
#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <sys/uio.h>
#include <time.h>

namespace mavoea::kernel {

// Files have 64-bit offsets, on 32-bit targets too.
static_assert(sizeof(off_t) == 8);

int Open(const char* path, int flags, mode_t mode);
// open(2) of a regular file: nothing else is opened, and nobody waited for but who has a lease on
// the file. ELOOP for a symbolic link, EISDIR for a directory, ENXIO for all else.
int OpenRegular(const char* path, int flags, mode_t mode);
// The same to read it here and now, in fewer calls; *size becomes the file's, in bytes.
int OpenToRead(const char* path, unsigned long long* size = nullptr);
int OpenAt(int dir, const char* path, int flags, mode_t mode);
int Close(int fd);
ssize_t Pread(int fd, void* buffer, size_t size, off_t offset);
ssize_t Preadv(int fd, const iovec* parts, int count, off_t offset);
ssize_t Pwrite(int fd, const void* bytes, size_t size, off_t offset);
ssize_t Pwritev(int fd, const iovec* parts, int count, off_t offset);
off_t Lseek(int fd, off_t offset, int whence);
int Ftruncate(int fd, off_t size);
int Reserve(int fd, off_t offset, off_t size);  // room on the volume; the file's size stays
int Fsync(int fd);
void Sync();
int Fstat(int fd, struct stat* info);
int Stat(const char* path, struct stat* info);
int Lstat(const char* path, struct stat* info);
int FstatAt(int dir, const char* path, struct stat* info, int flags);
int Access(const char* path, int mode);
int SetLock(int fd, const struct flock64* lock);  // F_SETLK, 64-bit
int GetLock(int fd, struct flock64* lock);        // F_GETLK, 64-bit

int MkdirAt(int dir, const char* path, mode_t mode);
int Link(const char* from, const char* to, int flags);  // linkat(2)
int Unlink(const char* path);
int UnlinkAt(int dir, const char* path, int flags);
int Rmdir(const char* path);
int Remove(const char* path);
int Rename(const char* from, const char* to);
int RenameAt(int from_dir, const char* from, int to_dir, const char* to);
int Chmod(const char* path, mode_t mode);
int Fchmod(int fd, mode_t mode);

char* Getcwd(char* buffer, size_t size);
DIR* Opendir(const char* path);
DIR* OpendirItself(const char* path);  // ENOTDIR when it is a symbolic link
dirent* Readdir(DIR* dir);
void Rewinddir(DIR* dir);
int Dirfd(DIR* dir);
int Closedir(DIR* dir);

uid_t Geteuid();
int Seteuid(uid_t uid);
pid_t Getpid();
time_t Time();
int System(const char* command);

ssize_t Listxattr(const char* path, char* names, size_t size);
ssize_t Getxattr(const char* path, const char* name, void* value, size_t size);
int Setxattr(const char* path, const char* name, const void* value, size_t size, int flags);
int Removexattr(const char* path, const char* name);

FILE* Fopen(const char* path, const char* mode);
size_t Fread(void* buffer, size_t size, FILE* stream);
size_t Fwrite(const void* bytes, size_t size, FILE* stream);
int Fclose(FILE* stream);

// The platform kernel's own file-control command 0x202: sets the SMB archive bit.
int SetArchiveBit(int fd);
int SetArchiveBit(const char* path);

// The platform kernel's own system call 403: a command of platform/marks.h about the file at path.
int FileCommand(const char* path, int command);

// The heap. `size` is 64-bit whatever the target: what does not fit in memory is out of memory.
void* Allocate(unsigned long long size);        // uninitialised
void* AllocateZeroed(unsigned long long size);  // zeroed
void* Reallocate(void* block, unsigned long long size);
void Free(void* block);

}  // namespace mavoea::kernel

#endif  // MAVOEA_PLATFORM_KERNEL_H_

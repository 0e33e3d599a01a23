// The archive, hidden and locked bits of a file, which the platform's kernel keeps.
//
// marks_kernel.cpp issues the platform kernel's calls and nothing else; marks_host.cpp, for other
// kernels, keeps the bits in an extended attribute where the kernel does not know those calls.
// MAVOEA_HOST_MARKS in CMake picks one of the two.
#ifndef MAVOEA_PLATFORM_MARKS_H_
#define MAVOEA_PLATFORM_MARKS_H_

#include <fcntl.h>

namespace mavoea::marks {

// File-control command that sets a file's SMB archive bit.
inline constexpr int kSetArchive = 0x202;

// The platform's system call that takes a path and one of the commands below it.
inline constexpr long kFileCommandCall = 403;
inline constexpr int kSetHidden = 0x203;
inline constexpr int kClearHidden = 0x206;
inline constexpr int kClearLocked = 521;  // the Mac lock
inline constexpr int kSetLocked = 522;

// Sets the archive bit of the file on fd. 0, or -1 with errno.
int SetArchiveBit(int fd);

// The same of the file at path, symbolic links followed, by who may read it.
int SetArchiveBit(const char* path);

// Opens a file for that. A FIFO without a writer must not hold the caller up.
inline int OpenToMark(const char* path) { return ::open(path, O_RDONLY | O_NONBLOCK | O_CLOEXEC); }

// Sets or clears the hidden or locked bit of the file at path, symbolic links followed. 0, or -1
// with errno.
int FileCommand(const char* path, int command);

}  // namespace mavoea::marks

#endif  // MAVOEA_PLATFORM_MARKS_H_

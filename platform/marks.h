// The archive, hidden and locked bits of a file, which the platform's kernel keeps.
//
// marks_kernel.cpp issues the platform kernel's calls and nothing else; marks_host.cpp, for other
// kernels, keeps the bits in an extended attribute where the kernel does not know those calls.
// MAVOEA_HOST_MARKS in CMake picks one of the two.
#ifndef MAVOEA_PLATFORM_MARKS_H_
#define MAVOEA_PLATFORM_MARKS_H_

namespace mavoea::marks {

// File-control command that sets a file's SMB archive bit.
inline constexpr int kSetArchive = 0x202;

// Sets the archive bit of the file on fd. 0, or -1 with errno.
int SetArchiveBit(int fd);

}  // namespace mavoea::marks

#endif  // MAVOEA_PLATFORM_MARKS_H_

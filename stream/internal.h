// What the stream units offer each other and the library's other units; none of it is exported.
#ifndef MAVOEA_STREAM_INTERNAL_H_
#define MAVOEA_STREAM_INTERNAL_H_

#include "include/mavoea.h"
#include "util/bytes.h"

namespace mavoea {

// The number of attributes in the stream on fd, 0 for an empty file; -1 and a code of
// MAVOEASOpen(). Takes a read lock meanwhile. The attribute table itself is not read.
int EASGetEntryCount(int fd);

// Which of the header's two entry descriptors is the Finder info, 0 or 1. -1: 0xD00 NULL, or more
// than 13 descriptors declared; 0xA00 neither is.
int EASGetFinderInfoIndex(EASHandle* h);

// Where the header says that the resource fork begins (behind the Finder info entry) and how long
// it is, in bytes. 0, or -1: NULL (no code), or as EASGetFinderInfoIndex().
int EASGetRForkRange(EASHandle* h, unsigned* start, unsigned* length);

// Moves the resource fork's `length` bytes from oldStart to newStart, making the file longer where
// it must be. 0, or -1: 0xD00 NULL handle or negative descriptor; otherwise no code, errno.
int EASShiftRFork(EASHandle* h, unsigned newStart, unsigned oldStart, unsigned length);

// Copies `length` bytes inside the file in steps of 16 KiB: from the front, or from the back with
// `backwards`, which overlapping ranges need when they move up. Ends early, with success, where the
// file does. 0; -13 on EIO; -9 when a write finds no space; -5 otherwise. Failures are logged, with
// no code.
int EASMoveRFork(int fd, unsigned length, unsigned newStart, unsigned oldStart, int backwards);

// Gives the attribute that value, in place of any that it has, in one rewrite; where it had one,
// the file then ends where its fork ends. h has the write lock. 0, or -1 with what MAVOEASWrite()
// gives.
int EASReplace(EASHandle* h, const char* name, ByteView value);

// Copies every attribute of the stream on srcFd into the one on dstFd, one rewrite and fsync each,
// both locked throughout. Attributes of the same name are replaced, of two of one name in the
// source by the second; others, Finder info and fork are kept. 0; -1 when a stream could not be
// opened (codes of MAVOEASOpen(), none for a negative descriptor); else -1 less the number of
// attributes that failed, with a code for each: 0x100 out of memory, 0xA00 not read, 0xB00 not
// written, behind MAVOEASWrite()'s own.
int EASWriteToFd(int srcFd, int dstFd);

}  // namespace mavoea

#endif  // MAVOEA_STREAM_INTERNAL_H_

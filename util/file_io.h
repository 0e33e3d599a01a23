// Reading and writing at an offset until all is done, whatever the kernel moves at a time.
#ifndef MAVOEA_UTIL_FILE_IO_H_
#define MAVOEA_UTIL_FILE_IO_H_

#include <cstdint>

#include "platform/kernel.h"
#include "util/bytes.h"

namespace mavoea {

// Fills `to` from `offset` on. Returns the bytes read, fewer only where the file ends; -1 with
// errno.
std::int64_t ReadAt(int fd, ByteSpan to, std::uint64_t offset);

// Fills the `count` parts, one after the other, from `offset` on; the parts are used up. False with
// errno when the file ends before, which is EIO.
bool ReadParts(int fd, iovec* parts, int count, std::uint64_t offset);

// Writes `from` at `offset`. Returns the bytes written, fewer than all with errno.
std::uint64_t WriteAt(int fd, ByteView from, std::uint64_t offset);

}  // namespace mavoea

#endif  // MAVOEA_UTIL_FILE_IO_H_

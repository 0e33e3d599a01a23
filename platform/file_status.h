// What the platform's extended stat tells of a file that the library looks at.
//
//   offset  size  field, in host order
//       16     4  mode, as st_mode
//      116     4  attribute word, MLIBC_ATTRIBUTE_...
//
// Shared by the library, which reads the result, and by libmavocore's MLIBCFileStat(), which makes
// it on a host.
#ifndef MAVOEA_PLATFORM_FILE_STATUS_H_
#define MAVOEA_PLATFORM_FILE_STATUS_H_

#include <string.h>

#include <cstddef>
#include <cstdint>

#include "platform/include/mavocore.h"

namespace mavoea {

inline constexpr std::size_t kFileStatusSize = 128;

struct FileStatus {
    std::uint32_t mode = 0;
    std::uint32_t attributes = 0;
};

inline FileStatus DecodeFileStatus(const unsigned char bytes[kFileStatusSize]) {
    FileStatus status;
    memcpy(&status.mode, bytes + 16, sizeof status.mode);
    memcpy(&status.attributes, bytes + 116, sizeof status.attributes);
    return status;
}

inline void EncodeFileStatus(const FileStatus& status, unsigned char bytes[kFileStatusSize]) {
    memset(bytes, 0, kFileStatusSize);
    memcpy(bytes + 16, &status.mode, sizeof status.mode);
    memcpy(bytes + 116, &status.attributes, sizeof status.attributes);
}

// Asks the platform about the object at path. False with errno.
inline bool ReadFileStatus(const char* path, FileStatus* status) {
    constexpr int kWithAttributes = 3;
    unsigned char bytes[kFileStatusSize] = {};
    if (MLIBCFileStat(path, kWithAttributes, bytes) != 0) return false;
    *status = DecodeFileStatus(bytes);
    return true;
}

}  // namespace mavoea

#endif  // MAVOEA_PLATFORM_FILE_STATUS_H_

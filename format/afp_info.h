// "AFP_AfpInfo", the stream in which SMB clients have a file's Finder info. Laid out by Services
// for Macintosh; all integers are big-endian. Samba keeps it as an extended attribute with a NUL
// behind it, see samba_stream.h: a value of any other size it removes.
//
//   offset  size  field
//        0     4  signature    "AFP" and a NUL
//        4     4  version      0x00000100
//        8     4  reserved     zeros
//       12     4  backup time  seconds from 2000-01-01 UTC, signed; 0x80000000 is none
//       16    32  Finder info
//       48     6  ProDOS info  file type of 2 bytes and auxiliary type of 4
//       54     6  reserved     zeros
#ifndef MAVOEA_FORMAT_AFP_INFO_H_
#define MAVOEA_FORMAT_AFP_INFO_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "format/apple_double.h"

namespace mavoea {

inline constexpr std::string_view kAfpInfoStream = "AFP_AfpInfo";

inline constexpr std::size_t kAfpInfoSize = 60;
inline constexpr std::uint32_t kNoBackupTime = 0x80000000;

struct AfpInfo {
    std::uint32_t backup_time = kNoBackupTime;
    std::array<std::uint8_t, kFinderInfoSize> finder_info{};
    std::array<std::uint8_t, 6> prodos_info{};
};

// All fields, whatever is in them.
struct AfpInfoFields {
    std::uint32_t signature = 0;
    std::uint32_t version = 0;
    std::uint32_t reserved = 0;
    AfpInfo info;
    std::array<std::uint8_t, 6> reserved_at_end{};

    bool HasSignature() const;
    bool HasVersion() const;
};
// None of fewer bytes; of more the first.
std::optional<AfpInfoFields> ReadAfpInfoFields(ByteView bytes);

// None of bytes of another size, signature or version. What is reserved may be anything.
std::optional<AfpInfo> DecodeAfpInfo(ByteView bytes);
std::array<std::uint8_t, kAfpInfoSize> EncodeAfpInfo(const AfpInfo& info);

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_AFP_INFO_H_

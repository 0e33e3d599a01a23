// Named streams as Samba's streams_xattr keeps them: one extended attribute each,
// "user.DosStream.NAME:$DATA", whose value is the stream's bytes and one byte more, a NUL.
//
// A value has room for kStreamValueMax bytes. Later versions of Samba can be told to go on in
// "user.DosStreamExt.N.NAME:$DATA"; the last byte of the first value is then how many such there
// are.
//
// Macs map what SMB forbids in names to private characters, and vfs_fruit's table is theirs:
// U+F001 to U+F01F for control characters, U+F020 to U+F027 for " * : < > ? \ | in this order. On
// disk is what the client has sent, or with "fruit:encoding = native" the plain character.
#ifndef MAVOEA_FORMAT_SAMBA_STREAM_H_
#define MAVOEA_FORMAT_SAMBA_STREAM_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "util/bytes.h"

namespace mavoea {

inline constexpr std::size_t kStreamValueMax = 65535;
inline constexpr std::size_t kXattrNameMax = 255;  // the kernel's, its NUL not included

// The name of an extended attribute, or what is a part of one.
class XattrName {
 public:
    std::string_view text() const { return {bytes_.data(), size_}; }

    // False, and nothing is added, where it does not fit.
    [[nodiscard]] bool Add(std::string_view text);

 private:
    std::array<char, kXattrNameMax> bytes_{};
    std::size_t size_ = 0;
};

struct StreamAttribute {
    XattrName name;            // of the stream, with plain characters
    std::uint32_t extent = 0;  // 0: the value that a stream begins with
};

// None of an attribute that holds no stream.
std::optional<StreamAttribute> DecodeStreamAttribute(std::string_view attribute);

// What a Mac's stream of that name is kept in; none of a name that is empty, too long, or has a NUL
// or a '/', by which no client can call it.
std::optional<XattrName> EncodeStreamAttribute(std::string_view name);

struct StreamValue {
    ByteView bytes;
    std::uint8_t extents = 0;  // values that go on with it, where those exist
};

// None of no bytes at all, which Samba cannot open.
std::optional<StreamValue> DecodeStreamValue(ByteView value);

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_SAMBA_STREAM_H_

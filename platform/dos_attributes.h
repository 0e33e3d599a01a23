// DOS attributes and the creation time as Samba keeps them in an extended attribute. From its
// xattr.idl, which describes NDR: little-endian, each field aligned to its size, to 4 bytes at
// most, from the start of the value.
//
//   size   field
//   1..    text      the attributes as "0x22" with a NUL: versions 1 to 3; empty since
//      2   version   1 to 5
//      2   version   once more, as the kind of what follows
//      ..  what that version has
//
//   versions 4 and 5                      version 3                    version 1
//   4  valid flags                        4  valid flags               4  attributes
//   4  attributes                         4  attributes                4  EA size
//   8  itime, only in version 4           4  EA size                   8  size
//   8  creation time                      8  size                      8  allocated size
//                                         8  allocated size            8  creation time
//                                         8  creation time             8  change time
//                                         8  change time
//
// Version 2 begins as version 3, with flags that mean nothing now. Or the value is the text alone.
//
// Of the layouts on disk this one stands down here: hosts keep marks of a file in it.
#ifndef MAVOEA_PLATFORM_DOS_ATTRIBUTES_H_
#define MAVOEA_PLATFORM_DOS_ATTRIBUTES_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace mavoea {

inline constexpr char kDosAttributesName[] = "user.DOSATTRIB";

inline constexpr std::uint32_t kDosReadOnly = 0x01;
inline constexpr std::uint32_t kDosHidden = 0x02;
inline constexpr std::uint32_t kDosSystem = 0x04;
inline constexpr std::uint32_t kDosDirectory = 0x10;
inline constexpr std::uint32_t kDosArchive = 0x20;

struct DosAttributes {
    std::uint32_t attributes = 0;
    std::optional<std::uint64_t> creation_time;  // in 100 ns from 1601-01-01 UTC
};

// The most bytes that Samba reads; a longer value is none to it.
inline constexpr std::size_t kDosAttributesMax = 256;

// Bits of the valid flags.
inline constexpr std::uint32_t kDosAttributesValid = 0x01;
inline constexpr std::uint32_t kDosCreationTimeValid = 0x10;

// All fields that a value has, whatever is in them; none of those that its version does not have,
// or that it ends before.
struct DosAttributesFields {
    std::string_view text;                 // without its NUL
    std::optional<std::uint16_t> version;  // none: the value is the text alone
    std::optional<std::uint16_t> version_again;
    std::size_t size = 0;  // that a value of this version has at least; 0: of no known one
    std::optional<std::uint32_t> valid_flags;
    std::optional<std::uint32_t> attributes;
    std::optional<std::uint64_t> creation_time;
};
// `bytes` outlive the fields.
DosAttributesFields ReadDosAttributesFields(std::span<const std::uint8_t> bytes);

// None of what Samba does not understand either, and takes for no attributes at all.
std::optional<DosAttributes> DecodeDosAttributes(std::span<const std::uint8_t> bytes);

// Changes the attributes of a value of version 1 to 5 and keeps all else of it. False, and the
// bytes are as they were, for every other value: what stands in for that is made anew.
[[nodiscard]] bool SetDosAttributes(std::span<std::uint8_t> bytes, std::uint32_t attributes);

inline constexpr std::size_t kDosAttributesSize = 24;
std::array<std::uint8_t, kDosAttributesSize> EncodeDosAttributes(const DosAttributes& value);

}  // namespace mavoea

#endif  // MAVOEA_PLATFORM_DOS_ATTRIBUTES_H_

// Finder info: what the Finder keeps of a file or a folder beside its comment. From the Carbon
// header "Finder.h"; all integers are big-endian, places are signed and in points.
//
//   offset  size  of a file           of a folder
//        0     4  type                its window: top, left
//        4     4  creator             its window: bottom, right
//        8     2  flags               the same
//       10     4  place: down, across in the window around it
//       14     2  number of that window, or how a folder is viewed
//       16     4  reserved            how far its window is scrolled: down, across
//       20     4  reserved
//       24     2  extended flags
//       26     2  number of the comment, on old systems
//       28     4  folder that it is put away to, signed
#ifndef MAVOEA_FORMAT_FINDER_INFO_H_
#define MAVOEA_FORMAT_FINDER_INFO_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

#include "format/apple_double.h"

namespace mavoea {

inline constexpr std::size_t kFinderFlagsOffset = 8;

inline constexpr std::uint16_t kFinderOnDesk = 0x0001;
inline constexpr std::uint16_t kFinderLabelMask = 0x000E;
inline constexpr int kFinderLabelShift = 1;  // below it: one of 8 labels, 0 none
inline constexpr std::uint16_t kFinderShared = 0x0040;
inline constexpr std::uint16_t kFinderNoInits = 0x0080;
inline constexpr std::uint16_t kFinderInited = 0x0100;
inline constexpr std::uint16_t kFinderCustomIcon = 0x0400;
inline constexpr std::uint16_t kFinderStationery = 0x0800;
inline constexpr std::uint16_t kFinderNameLocked = 0x1000;
inline constexpr std::uint16_t kFinderHasBundle = 0x2000;
inline constexpr std::uint16_t kFinderInvisible = 0x4000;
inline constexpr std::uint16_t kFinderAlias = 0x8000;

struct FinderPoint {
    std::int16_t down = 0;
    std::int16_t across = 0;

    friend constexpr bool operator==(const FinderPoint&, const FinderPoint&) = default;
};

// What a file and a folder have in common.
struct FinderItem {
    std::uint16_t flags = 0;
    FinderPoint place;
    std::uint16_t window = 0;
    std::array<std::uint8_t, 4> reserved{};
    std::uint16_t extended_flags = 0;
    std::uint16_t comment = 0;
    std::int32_t put_away = 0;

    constexpr std::uint8_t label() const {
        return static_cast<std::uint8_t>((flags & kFinderLabelMask) >> kFinderLabelShift);
    }
    constexpr void SetLabel(std::uint8_t label) {
        flags = static_cast<std::uint16_t>((flags & ~kFinderLabelMask) |
                                           (label << kFinderLabelShift & kFinderLabelMask));
    }
};

using FourBytes = std::array<std::uint8_t, 4>;

struct FileFinderInfo {
    FourBytes type{};
    FourBytes creator{};
    FourBytes reserved{};
    FinderItem item;
};

struct FolderFinderInfo {
    FinderPoint window_begin;  // top, left
    FinderPoint window_end;    // bottom, right
    FinderPoint scrolled;
    FinderItem item;
};

// All 32 bytes mean something, and come back as they were.
using FinderInfoView = std::span<const std::uint8_t, kFinderInfoSize>;
using FinderInfoBytes = std::array<std::uint8_t, kFinderInfoSize>;

FileFinderInfo DecodeFileFinderInfo(FinderInfoView bytes);
FolderFinderInfo DecodeFolderFinderInfo(FinderInfoView bytes);
FinderInfoBytes EncodeFinderInfo(const FileFinderInfo& info);
FinderInfoBytes EncodeFinderInfo(const FolderFinderInfo& info);

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_FINDER_INFO_H_

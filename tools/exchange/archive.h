// Files that hold what a Mac's file has beside its data, or all of it: AppleDouble, AppleSingle,
// MacBinary and BinHex, as they are read.
#ifndef MAVOEA_TOOLS_EXCHANGE_ARCHIVE_H_
#define MAVOEA_TOOLS_EXCHANGE_ARCHIVE_H_

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "tools/place/directory.h"
#include "tools/store/content.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

enum class ArchiveFormat { kAppleDouble, kAppleSingle, kMacBinary, kBinHex };
// "AppleDouble"
const char* NameOf(ArchiveFormat format);

// The most that each fork in a BinHex file may have: its text is read at once.
inline constexpr std::uint64_t kBinHexForkMax = std::uint64_t{1} << 30;

// An entry of AppleSingle files, of which bit 0 says that the file is locked.
inline constexpr EntryId kMacInfo = static_cast<EntryId>(10);
inline constexpr std::size_t kMacInfoSize = 4;
inline constexpr EntryId kRealName = static_cast<EntryId>(3);

struct Archive {
    ArchiveFormat format = ArchiveFormat::kAppleDouble;
    std::string name = {};             // as UTF-8 where that is known; empty: none
    std::optional<Content> data = {};  // none: it holds metadata only
    Metadata metadata = {};
    std::optional<std::int64_t> modified = {};  // in seconds since 1970-01-01 UTC
};

// By the file's content. `scratch`: where what has to be unpacked may lie for a time, without a
// name. Throws Failure for what is none of the four, and for what is damaged.
Archive ReadArchive(const std::shared_ptr<const File>& file, const DirectoryRef& scratch);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_ARCHIVE_H_

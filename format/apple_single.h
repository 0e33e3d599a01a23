// AppleSingle: all parts of a Mac's file in one, under the header and the descriptors of
// AppleDouble. From Apple's "AppleSingle/AppleDouble Formats for Foreign Files"; all integers are
// big-endian.
#ifndef MAVOEA_FORMAT_APPLE_SINGLE_H_
#define MAVOEA_FORMAT_APPLE_SINGLE_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

#include "format/apple_double.h"

namespace mavoea {

inline constexpr std::uint32_t kAppleSingleMagic = 0x00051600;

// Entries beside those that EntryId names.
inline constexpr std::uint32_t kSingleDataFork = 1;
inline constexpr std::uint32_t kSingleRealName = 3;
inline constexpr std::uint32_t kSingleComment = 4;
inline constexpr std::uint32_t kSingleFileInfo = 7;   // of version 1: what 8 and 10 hold since
inline constexpr std::uint32_t kSingleFileDates = 8;  // as in a netatalk record
inline constexpr std::uint32_t kSingleMacInfo = 10;   // 4 bytes, bit 0: locked, bit 1: protected

struct SingleEntry {
    std::uint32_t id = 0;
    Range data;
};

// A file whose header and descriptors were found in order, all data within the file.
class AppleSingle {
 public:
    std::uint32_t version() const { return version_; }
    std::uint16_t entry_count() const { return count_; }
    SingleEntry entry(std::uint16_t index) const;  // index < entry_count()

    // The data of the first entry with that id.
    std::optional<Range> Find(std::uint32_t id) const;

 private:
    friend std::optional<AppleSingle> DecodeAppleSingle(ByteView head, std::uint64_t file_size);

    std::uint32_t version_ = 0;
    std::uint16_t count_ = 0;
    ByteView descriptors_;
};

// From a file's first bytes, which stay where they are: none where they are no AppleSingle file's,
// or do not hold all descriptors.
std::optional<AppleSingle> DecodeAppleSingle(ByteView head, std::uint64_t file_size);

// The head of a file of version 2 with the entries' data behind it, one after the other, into
// DescriptorsEnd(entries.size()) bytes. The lengths are the caller's, the offsets are set here;
// false where an offset or the end has no place in 32 bits.
[[nodiscard]] bool EncodeAppleSingleHead(std::span<SingleEntry> entries, ByteSpan head);

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_APPLE_SINGLE_H_

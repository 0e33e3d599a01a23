// AppleDouble files, netatalk records and the table of streams by the formats' own rules, for
// targets to compare the library with. Nothing of the library is used.
#ifndef MAVOEA_FUZZ_SUPPORT_APPLE_DOUBLE_MODEL_H_
#define MAVOEA_FUZZ_SUPPORT_APPLE_DOUBLE_MODEL_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "fuzz/support/volume.h"

namespace mavoea::fuzz {

// Big-endian fields; bytes outside are zeros.
std::uint16_t Field16(View bytes, std::uint64_t at);
std::uint32_t Field32(View bytes, std::uint64_t at);

bool Holds(View bytes, std::uint64_t at, std::uint64_t length);

struct Descriptor {
    std::uint32_t id = 0;
    std::uint32_t offset = 0;
    std::uint32_t length = 0;
};

// The descriptors that the header declares; nothing when the file ends before they do.
std::optional<std::vector<Descriptor>> DescriptorsOf(View file);

// What EACopyAdoubleV2() makes of a file, nothing where it refuses it. An empty file becomes none,
// and is not asked about.
std::optional<Bytes> Rewritten(View file);

// An attribute in a stream's table, its name up to the first NUL.
struct TableEntry {
    std::string name;
    std::uint32_t offset = 0;
    std::uint32_t length = 0;
};

// What opening a stream reads.
struct OpenedStream {
    int code = 0;  // that is recorded when it cannot be opened
    std::uint32_t finder_info_offset = 0;
    bool has_finder_info = false;
    Bytes finder_info = Bytes(32);
    unsigned attribute_count = 0;  // that the header declares
    std::vector<TableEntry> table = {};
};
OpenedStream OpenStream(View file);

// Whether the header alone is acceptable, of which the count is known then.
OpenedStream OpenStreamHeader(View file);

using Attributes = std::map<std::string, Bytes>;

// Puts the table's attributes into `to`, in order, in the place of those of the same name. How many
// could not be.
int Import(View file, const std::vector<TableEntry>& table, Attributes* to);

}  // namespace mavoea::fuzz

#endif  // MAVOEA_FUZZ_SUPPORT_APPLE_DOUBLE_MODEL_H_

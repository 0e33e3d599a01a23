// Sources for resource_copy_fuzz: source type, destination type, choices, 16 bits for the size of
// the resource file, the resource file, the stream.

#include "fuzz/seeds.h"
#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::fuzz {
namespace {

using namespace mavoea::test;

constexpr std::uint8_t kResource = 16;
constexpr std::uint8_t kStream = 32;

// Indexes into the target's tables of types.
constexpr std::uint8_t kSources[] = {0, 2, 6, 7};
constexpr std::uint8_t kDestinations[] = {0, 2, 6, 7, 8};

Bytes Sized(const Bytes& bytes) {
    Bytes size(2);
    PutU16(size, 0, static_cast<std::uint32_t>(bytes.size()));
    return size + bytes;
}

}  // namespace

void WriteResourceCopySeeds(const std::string& directory) {
    const Bytes resources[] = {
        ClassicFile(Pattern(32, 1), Pattern(100, 2)).bytes,
        ClassicFile(Pattern(32, 3), BlankFork()).bytes,
        ThirteenEntryFile(Pattern(32, 4), Pattern(60, 5)).bytes,
        NetatalkFile(Pattern(32, 6), Pattern(40, 7)).bytes,
        PlainAppleDouble(Pattern(32, 13), Pattern(20, 14), 3),
        StreamImage{.attributes = {{"a", Pattern(3)}, {"b", Pattern(1100)}},
                    .fork = Pattern(30, 8),
                    .finder_info = Pattern(32, 9)}
            .Build(),
    };
    const Bytes stream =
        StreamImage{.attributes = {{"name", Pattern(30)}, {"empty", {}}, {"long", Pattern(1500)}}}
            .Build();
    // Of an object with real attributes: Finder info and fork, then three others.
    const Bytes values = Bytes{32} + Pattern(32, 10) + Pattern(90, 11);
    const Bytes attributes =
        Hex("01 'a' 00 03 'abc'  06 'user.b' 00 00  02 'cc' 04 B0") + Pattern(1200, 12);
    std::uint8_t choices = 0;
    int number = 0;
    const auto write = [&](std::uint8_t src, std::uint8_t dst, std::uint8_t bits,
                           const Bytes& resource, const Bytes& rest) {
        WriteFile(directory + "/" + std::to_string(number++),
                  Bytes{src, dst, bits} + Sized(resource) + rest);
    };
    for (const std::uint8_t src : kSources) {
        for (const std::uint8_t dst : kDestinations) {
            // Moves, copiers and what else there is to choose, in turn.
            choices = static_cast<std::uint8_t>((choices + 0x4D) & ~(kResource | kStream));
            const auto both = static_cast<std::uint8_t>(choices | kResource | kStream);
            if (src == 7) {
                write(src, dst, both, values, attributes);
                continue;
            }
            for (const Bytes& resource : resources) write(src, dst, both, resource, stream);
            write(src, dst, static_cast<std::uint8_t>(choices | kStream), {}, stream);
        }
    }
}

}  // namespace mavoea::fuzz

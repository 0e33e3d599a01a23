// EA directories for upgrade_fuzz: two bytes of choices, then the "._" file (with choice 0x20 of
// the second), then the legacy folder's entries. Each is sort, access time, name, contents; the
// "._" file has no name.

#include "fuzz/seeds.h"
#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::fuzz {
namespace {

using namespace mavoea::test;

constexpr std::uint8_t kStreamKind = 0;
constexpr std::uint8_t kResourceKind = 2;
constexpr std::uint8_t kOtherKind = 3;
constexpr std::uint8_t kByOpen = 4;
constexpr std::uint8_t kCreates = 8;
constexpr std::uint8_t kHasCurrent = 16;
constexpr std::uint8_t kOddFolder = 0xE0;
constexpr std::uint8_t kWithAppleDouble = 32;

// The second byte's choices of a legacy folder that is none, and of an object.
constexpr std::uint8_t kOddFolders[] = {0x40, 0x80, 0xC0};
constexpr std::uint8_t kObjects[] = {0, 8, 16, 24};

constexpr std::uint8_t kFile = 0;
constexpr std::uint8_t kLink = 5;
constexpr std::uint8_t kDanglingLink = 6;
constexpr std::uint8_t kPipe = 7;
constexpr std::uint8_t kDirectory = 8;

Bytes Contents(const Bytes& bytes) {
    Bytes size(2);
    PutU16(size, 0, static_cast<std::uint32_t>(bytes.size()));
    return size + bytes;
}

Bytes AppleDouble(std::uint8_t read_at, const Bytes& bytes, std::uint8_t sort = kFile) {
    return Bytes{sort, read_at} + Contents(bytes);
}

// Without a name it is the legacy file of the kind that is upgraded.
Bytes Entry(const std::string& name, const Bytes& bytes, std::uint8_t read_at = 100,
            std::uint8_t sort = kFile) {
    return Bytes{sort, read_at, static_cast<std::uint8_t>(name.size())} + Ascii(name) +
           Contents(bytes);
}

}  // namespace

void WriteUpgradeSeeds(const std::string& directory) {
    int number = 0;
    const auto write = [&](const Bytes& input) {
        WriteFile(directory + "/" + std::to_string(number++), input);
    };
    const Bytes files = Entry("color", Ascii("blue")) + Entry("tags", Pattern(300), 50) +
                        Entry("empty", {}) + Entry("a:b", Ascii("x")) +
                        Entry("MAVO:Resource", Pattern(20)) + Entry(std::string(255, 'n'), {1});
    const Bytes hostile = Entry("link", {}, 9, kLink) + Entry("gone", {}, 9, kDanglingLink) +
                          Entry("pipe", {}, 9, kPipe) + Entry("sub", {}, 9, kDirectory);
    const Bytes sidecar =
        MacSidecar({{{"com.apple.quarantine", Ascii("0083")}}, Pattern(32, 1), {}}).bytes;
    const Bytes small = StreamImage{.attributes = {{"a", Pattern(3)}}}.Build();

    for (const std::uint8_t how : {std::uint8_t{0}, kByOpen, std::uint8_t{kByOpen | kCreates}}) {
        const auto stream = static_cast<std::uint8_t>(kStreamKind | how);
        write(Bytes{stream, 0} + files);
        write(Bytes{stream, 0} + files + hostile);
        write(Bytes{stream, 0} + hostile);
        write(Bytes{stream, 0});
        write(Bytes{stream, kWithAppleDouble} + AppleDouble(200, small) + files);
        write(Bytes{stream, kWithAppleDouble} + AppleDouble(20, sidecar) + files);
        write(Bytes{stream, kWithAppleDouble} + AppleDouble(100, small) + files);
        write(Bytes{stream, kWithAppleDouble} + AppleDouble(200, {}, kLink) + files);
        write(Bytes{stream, kWithAppleDouble} + AppleDouble(200, {}, kPipe) + files);
        write(Bytes{static_cast<std::uint8_t>(stream | kHasCurrent), 0} + files);
        write(Bytes{static_cast<std::uint8_t>(stream | kHasCurrent), kDanglingLink} + files);
        write(Bytes{static_cast<std::uint8_t>(stream | kHasCurrent), kPipe} + files);
        for (const std::uint8_t odd : kOddFolders) {
            write(Bytes{static_cast<std::uint8_t>(stream | kOddFolder), odd});
        }

        const auto resource = static_cast<std::uint8_t>(kResourceKind | how);
        for (const std::uint8_t object : kObjects) {
            const Bytes finder_info = Hex("'TEXTttxt' 40 00 00*22");
            write(Bytes{resource, object} +
                  Entry("", NetatalkFile(finder_info, Pattern(20, 2)).bytes));
            write(Bytes{resource, object} + Entry("", ThirteenEntryFile(Pattern(32, 3), {}).bytes) +
                  files);
        }
        Bytes invisible = NetatalkFile(Pattern(32), {}).bytes;
        PutU32(invisible, 689, 1);  // its AFP file info
        write(Bytes{resource, 0} + Entry("", invisible));
        write(Bytes{resource, 0} + Entry("", ClassicFile(Pattern(32, 4), {}).bytes));
        for (const std::uint8_t sort : {kLink, kDanglingLink, kPipe, kDirectory}) {
            write(Bytes{resource, 0} + Entry("", {}, 1, sort));
        }
        write(Bytes{static_cast<std::uint8_t>(resource | kOddFolder), 0x80});
    }
    write(Bytes{kOtherKind, 0} + Entry("", Pattern(10)));
    write(Bytes{kOtherKind, 0} + Entry("", Pattern(10)) + Entry("MAVO@x", Pattern(9)));
    write(Bytes{kOtherKind, 0} + Entry("", {}, 1, kLink));
    write(Bytes{kOtherKind | kOddFolder, 0x80});
}

}  // namespace mavoea::fuzz

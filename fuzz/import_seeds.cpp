// AppleDouble files for import_fuzz: a byte of choices, then the file.

#include "fuzz/seeds.h"
#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteImportSeeds(const std::string& directory) {
    int number = 0;
    const auto write = [&](const Bytes& file) {
        const auto choices = static_cast<std::uint8_t>(number * 5 + 1);
        WriteFile(directory + "/" + std::to_string(number++), Bytes{choices} + file);
    };
    write({});
    write(Hex("00 05 16 07"));
    for (std::size_t attributes = 0; attributes <= 3; ++attributes) {
        StreamImage image{.fork = Pattern(30, 1), .finder_info = Pattern(32, 2)};
        for (std::size_t i = 0; i < attributes; ++i) {
            image.attributes.push_back({std::string(i + 1, 'a'), Pattern(40 * i, 3)});
        }
        write(image.Build());
        image.fork_first = true;
        image.gap = 8;
        image.slack = 20;
        write(image.Build());
        image.descriptor_count = 13;
        write(image.Build());
    }
    write(ClassicFile(Pattern(32, 4), Pattern(100, 5)).bytes);
    write(ClassicFile(Pattern(32, 6), BlankFork()).bytes);
    write(ThirteenEntryFile(Pattern(32, 7), Pattern(100, 8)).bytes);
    write(NetatalkFile(Pattern(32, 9), Pattern(100, 10)).bytes);
    for (const unsigned count : {3U, 14U}) {
        write(PlainAppleDouble(Pattern(32, 11), Pattern(20, 12), count));
    }
    for (const std::size_t size : {std::size_t{62}, std::size_t{63}}) {
        Bytes fork = BlankFork();
        fork.resize(size);
        write(ClassicFile(Pattern(32, 13), fork).bytes);
    }
    write(StreamImage{.attributes = {{"a", Pattern(9)}, {"b", {}}, {"a", Pattern(2)}}}.Build());
    write(StreamImage{.version = 0x00010000}.Build());
    write(
        MacSidecar({{{"com.apple.quarantine", Ascii("0083;00000000;;")}}, Pattern(32), {}}).bytes);
}

}  // namespace mavoea::fuzz

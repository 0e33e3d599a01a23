// Records for record_fuzz: two bytes of choices, then the block.

#include "fuzz/seeds.h"
#include "tests/support/mac_files.h"
#include "tests/support/record_builder.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteRecordSeeds(const std::string& directory) {
    int number = 0;
    const auto write = [&](const Bytes& block) {
        const auto lock = static_cast<std::uint8_t>(number % 2);
        WriteFile(directory + "/" + std::to_string(number++), Bytes{lock, 0x5A} + block);
    };
    const Bytes record = AttributeRecord();
    write(record);
    Bytes changed = record;
    PutU16(changed, 24, 7);
    write(changed);
    changed = record;
    PutU32(changed, 26, 0x80000000);
    write(changed);
    changed.resize(401);
    write(changed);

    changed = record;  // Finder info and AFP file info that are too short.
    PutU32(changed, 34, 31);
    PutU32(changed, 70, 3);
    write(changed);

    changed = record;  // All of its entries, and a ninth.
    PutU16(changed, 24, 9);
    PutU32(changed, 122, 2);
    PutU32(changed, 126, 741);
    PutU32(changed, 130, 1000);
    write(changed);

    write(NetatalkFile(Pattern(32, 1), {}).bytes);
    write(NetatalkFile(Pattern(32, 2), Pattern(100, 3)).bytes);
    for (const std::size_t size : {std::size_t{0}, std::size_t{740}, std::size_t{1025}}) {
        changed = NetatalkFile(Pattern(32, 4), Pattern(300, 5)).bytes;
        changed.resize(size);
        write(changed);
    }
    write(OneEntry(2, 741, 1000000));
    write(OneEntry(9, 992, 32));
    write(OneEntry(9, 741, 1000000));
    write(OneEntry(14, 1020, 4, 1024));
    write(OneEntry(9, 1024, 0));
    write(OneEntry(0x80444556, 100, 0, 402));

    write(ClassicFile(Pattern(32, 6), Pattern(20, 7)).bytes);
    write(ThirteenEntryFile(Pattern(32, 8), Pattern(20, 9)).bytes);
    write(StreamImage{.attributes = {{"a", Pattern(3)}, {"name", Pattern(40)}}}.Build());
}

}  // namespace mavoea::fuzz

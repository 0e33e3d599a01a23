// Seeds of stream_fuzz: streams of every kind that the tests build, each with some operations.

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "fuzz/seeds.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {
namespace {

using namespace mavoea::test;

// A file as the target takes it, and bytes to choose operations by.
Bytes Input(const Bytes& file, std::uint8_t seed, std::size_t choices) {
    Bytes input = {0, static_cast<std::uint8_t>(file.size() >> 8),
                   static_cast<std::uint8_t>(file.size() & 0xFF)};
    return input + file + Pattern(choices, seed);
}

std::vector<std::pair<std::string, Bytes>> Files() {
    const StreamImage plain{
        .attributes = {{"a", Ascii("one")}, {"user.comment", Pattern(50)}, {"b", Ascii("three")}},
        .fork = Pattern(300),
        .finder_info = Pattern(32, 9)};
    std::vector<std::pair<std::string, Bytes>> files = {
        {"empty", {}},
        {"no-attributes", StreamImage{}.Build()},
        {"three-and-fork", plain.Build()},
        {"plain-2", PlainAppleDouble(Pattern(32, 3), Pattern(100))},
        {"plain-13", PlainAppleDouble(Pattern(32, 4), Pattern(100), 13)},
        {"plain-14", PlainAppleDouble(Pattern(32, 5), Pattern(100), 14)},
    };
    const auto add = [&](const char* name, auto change) {
        StreamImage image = plain;
        change(&image);
        files.emplace_back(name, image.Build());
    };
    add("fork-first", [](StreamImage* image) { image->fork_first = true; });
    add("slack", [](StreamImage* image) { image->slack = 500; });
    add("gap", [](StreamImage* image) { image->gap = 256; });
    add("thirteen-descriptors", [](StreamImage* image) { image->descriptor_count = 13; });
    add("empty-values", [](StreamImage* image) {
        for (Attribute& attribute : image->attributes) attribute.value.clear();
    });
    add("same-names", [](StreamImage* image) { image->attributes[2].name = "a"; });
    add("flags", [](StreamImage* image) {
        image->flags = 0x1234;
        image->attributes[1].flags = 0x5678;
        image->debug_tag = 0x9ABCDEF0;
    });
    add("long-names", [](StreamImage* image) {
        image->attributes = {{std::string(241, 'm'), Ascii("x")}, {std::string(254, 'n'), {}}};
    });
    add("many", [](StreamImage* image) {
        image->attributes.clear();
        for (unsigned i = 0; i < 100; ++i) {
            image->attributes.push_back({"name" + std::to_string(i), Pattern(i % 9)});
        }
    });
    // Fields that do not fit together.
    const auto damage = [&](const char* name, std::size_t at, std::uint32_t value) {
        Bytes bytes = plain.Build();
        PutU32(bytes, at, value);
        files.emplace_back(name, bytes);
    };
    damage("fork-length-extreme", kForkLengthAt, 0xFFFFFFFF);
    damage("fork-elsewhere", kForkOffsetAt, 50);
    damage("finder-elsewhere", kFinderOffsetAt, 60);
    damage("no-finder", kFinderIdAt, 77);
    damage("start-inside-table", kDataStartAt, 121);
    damage("length-extreme", kDataLengthAt, 0xFFFFFFFF);
    damage("value-outside", kTableAt, 0x7FFFFFFF);
    damage("value-length-extreme", kTableAt + 4, 0xFFFFFFFF);
    return files;
}

}  // namespace

void WriteStreamSeeds(const std::string& directory) {
    std::uint8_t seed = 0;
    for (const auto& [name, file] : Files()) {
        for (const std::size_t choices : {0u, 60u, 400u}) {
            WriteFile(directory + "/" + name + "-" + std::to_string(choices),
                      Input(file, ++seed, choices));
        }
    }
    for (const std::size_t choices : {100u, 1000u}) {
        WriteFile(directory + "/new-" + std::to_string(choices),
                  Bytes{1} + Pattern(choices, ++seed));
    }
}

}  // namespace mavoea::fuzz

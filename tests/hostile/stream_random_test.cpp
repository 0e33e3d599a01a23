// A million operations, chosen at random but the same ones every time, on streams and on their
// model.

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <random>
#include <string>
#include <vector>

#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_exercise.h"

// Where the tests are compiled with sanitizers each operation takes much longer.
#if defined(__SANITIZE_ADDRESS__)
#define MAVOEA_SANITIZED 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define MAVOEA_SANITIZED 1
#endif
#endif
#ifndef MAVOEA_SANITIZED
#define MAVOEA_SANITIZED 0
#endif

namespace mavoea::test {
namespace {

constexpr int kTests = 10;

// How many operations each test makes, all of them together a million. The environment may ask for
// more, or for fewer.
int Operations() {
    const char* const asked = std::getenv("MAVOEA_RANDOM_OPERATIONS");
    const int all = asked != nullptr        ? std::atoi(asked)
                    : kEmulated             ? 50'000
                    : MAVOEA_SANITIZED != 0 ? 100'000
                                            : 1'000'000;
    return all / kTests;
}

class StreamRandomTest : public ::testing::Test {
 protected:
    StreamRandomTest() {
        ResetKernel();
        ResetPlatform();
        Hooks().fsync = [](int) { return 0; };
    }
    ~StreamRandomTest() override {
        ResetKernel();
        ResetPlatform();
    }

    static std::vector<int> TakeCodes() {
        std::vector<int> codes;
        for (const Record& record : TakeRecords()) codes.push_back(record.code);
        return codes;
    }

    unsigned Below(unsigned limit) { return static_cast<unsigned>(random_() % limit); }

    // Streams that begin as `image` says, each with up to `most` operations.
    template <class Image>
    void Run(unsigned seed, int most, Image image) {
        random_.seed(seed);
        const int live = TakeAllocations().live;
        const int wanted = Operations();
        int made = 0;
        int streams = 0;
        for (; made < wanted; ++streams) {
            StreamExercise exercise({.below = [this](unsigned limit) { return Below(limit); },
                                     .take_codes = TakeCodes});
            ASSERT_EQ("", exercise.Begin(image())) << "stream " << streams;
            ++made;
            for (int step = 1; step < most && exercise.open() && made < wanted; ++step, ++made) {
                ASSERT_EQ("", exercise.Step())
                    << "stream " << streams << ", step " << step << ": " << exercise.last();
                TakeCalls();
            }
            ASSERT_EQ("", exercise.End()) << "stream " << streams;
        }
        EXPECT_EQ(live, TakeAllocations().live);
        std::printf("%d operations on %d streams\n", made, streams);
        RecordProperty("operations", made);
    }

    std::mt19937 random_;
};

StreamImage Plain() {
    return {.attributes = {{"a", Ascii("one")}, {"user.comment", Pattern(50)}, {"b", {}}},
            .fork = Pattern(300),
            .finder_info = Pattern(32, 9)};
}

TEST_F(StreamRandomTest, NewStreams) {
    Run(1, 300, [] { return Bytes{}; });
}

TEST_F(StreamRandomTest, MoreNewStreams) {
    Run(2, 30, [] { return Bytes{}; });
}

TEST_F(StreamRandomTest, StreamsWithSomeAttributesAndAFork) {
    Run(3, 100, [] { return Plain().Build(); });
}

TEST_F(StreamRandomTest, StreamsWithForksAroundTheStepsThatTheyMoveIn) {
    Run(4, 50, [this] {
        StreamImage image = Plain();
        image.fork = Pattern(16384 * (1 + Below(3)) - 1 + Below(3));
        return image.Build();
    });
}

TEST_F(StreamRandomTest, StreamsWithAHundredAttributes) {
    Run(5, 50, [] {
        StreamImage image{.fork = Pattern(77)};
        for (unsigned i = 0; i < 100; ++i) {
            image.attributes.push_back({"name" + std::to_string(i), Pattern(i % 9)});
        }
        return image.Build();
    });
}

TEST_F(StreamRandomTest, StreamsWithGapsSlackForeignFieldsAndManyDescriptors) {
    Run(6, 50, [this] {
        StreamImage image = Plain();
        image.gap = Below(2) * 256;
        image.slack = Below(2) * Below(4000);
        image.fork_first = Below(2) == 0;
        image.descriptor_count = static_cast<std::uint16_t>(2 + Below(2) * Below(13));
        image.pad = static_cast<std::uint16_t>(Below(0x10000));
        image.debug_tag = Below(0xFFFFFFFF);
        image.flags = static_cast<std::uint16_t>(Below(0x10000));
        image.reserved = Pattern(12, static_cast<std::uint8_t>(Below(256)));
        image.attributes[Below(3)].flags = static_cast<std::uint16_t>(Below(0x10000));
        image.attributes[Below(3)].name = "a";
        return image.Build();
    });
}

TEST_F(StreamRandomTest, PlainAppleDoubleFiles) {
    Run(7, 50, [this] {
        return PlainAppleDouble(Pattern(32, 3), Pattern(Below(2) * Below(20000)), 2 + Below(13));
    });
}

TEST_F(StreamRandomTest, FilesThatHaveBeenCutShort) {
    Run(8, 20, [this] {
        Bytes bytes = Plain().Build();
        bytes.resize(Below(static_cast<unsigned>(bytes.size())));
        return bytes;
    });
}

TEST_F(StreamRandomTest, FilesWithAFewDamagedBytes) {
    Run(9, 20, [this] {
        Bytes bytes = Plain().Build();
        for (unsigned left = 1 + Below(4); left > 0; --left) {
            bytes[Below(220)] = static_cast<std::uint8_t>(Below(256));
        }
        return bytes;
    });
}

TEST_F(StreamRandomTest, FilesWithDamagedFields) {
    Run(10, 20, [this] {
        static constexpr std::uint32_t kValues[] = {
            0,          1,          49,   50,         82,         120,       121,
            0x7FFFFFFF, 0x80000000, 4096, 0xFFFFFF88, 0xFFFFFFFE, 0xFFFFFFFF};
        static constexpr std::size_t kFields[] = {kFinderIdAt,  kFinderOffsetAt, kFinderLengthAt,
                                                  kForkIdAt,    kForkOffsetAt,   kForkLengthAt,
                                                  kTotalSizeAt, kDataStartAt,    kDataLengthAt,
                                                  kTableAt,     kTableAt + 4,    kTableAt + 16};
        Bytes bytes = Plain().Build();
        for (unsigned left = 1 + Below(2); left > 0; --left) {
            const std::size_t field = kFields[Below(std::size(kFields))];
            const std::uint32_t value = kValues[Below(std::size(kValues))];
            // Near what it was, or far from it.
            PutU32(bytes, field,
                   Below(2) == 0 ? value : U32At(bytes, field) + Below(33) - std::uint32_t{16});
        }
        return bytes;
    });
}

}  // namespace
}  // namespace mavoea::test

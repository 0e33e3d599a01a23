// The bytes of AppleSingle files' heads.

#include "format/apple_single.h"

#include <gmock/gmock.h>

#include <vector>

#include "tests/support/damage.h"
#include "tests/support/mac_files.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAreArray;

const Bytes kHead =
    Hex("00 05 16 00 "                            //  0  magic
        "00 02 00 00 "                            //  4  version
        "00*16 "                                  //  8  filler
        "00 03 "                                  // 24  entries
        "00 00 00 03 00 00 00 3E 00 00 00 05 "    // 26  real name at 62
        "00 00 00 09 00 00 00 43 00 00 00 20 "    // 38  Finder info at 67
        "00 00 00 01 00 00 00 63 00 01 00 00 ");  // 50  data fork at 99
constexpr std::uint64_t kFileSize = 99 + 65536;

void ExpectEntry(const AppleSingle& file, std::uint32_t id, Range data) {
    const auto found = file.Find(id);
    ASSERT_TRUE(found);
    EXPECT_EQ(data, *found);
}

TEST(AppleSingleTest, EntriesAreFoundByTheirIds) {
    const auto file = DecodeAppleSingle(kHead, kFileSize);
    ASSERT_TRUE(file);
    EXPECT_EQ(0x00020000U, file->version());
    ASSERT_EQ(3, file->entry_count());
    EXPECT_EQ(kSingleRealName, file->entry(0).id);
    EXPECT_EQ((Range{62, 5}), file->entry(0).data);
    EXPECT_EQ(kSingleDataFork, file->entry(2).id);
    ExpectEntry(*file, 3, {62, 5});
    ExpectEntry(*file, 9, {67, 32});
    ExpectEntry(*file, 1, {99, 65536});
    EXPECT_FALSE(file->Find(2));
}

TEST(AppleSingleTest, OfTwoEntriesWithOneIdTheFirstCounts) {
    Bytes head = kHead;
    head[41] = 1;
    const auto file = DecodeAppleSingle(head, kFileSize);
    ASSERT_TRUE(file);
    ExpectEntry(*file, 1, {67, 32});
}

TEST(AppleSingleTest, Version1IsTakenAndAnyFiller) {
    Bytes head = kHead;
    head[5] = 1;
    std::fill_n(head.begin() + 8, 16, 0xEE);
    const auto file = DecodeAppleSingle(head, kFileSize);
    ASSERT_TRUE(file);
    EXPECT_EQ(0x00010000U, file->version());
}

TEST(AppleSingleTest, AnotherMagicOrVersionIsNone) {
    for (const std::size_t at : {0U, 1U, 2U, 3U, 4U, 5U, 6U, 7U}) {
        SCOPED_TRACE(at);
        Bytes head = kHead;
        head[at] ^= 0x40;
        EXPECT_FALSE(DecodeAppleSingle(head, kFileSize));
    }
    EXPECT_FALSE(DecodeAppleSingle(Hex("00 05 16 07 00 02 00 00 00*18"), 26));  // AppleDouble
    EXPECT_FALSE(
        DecodeAppleSingle(Hex("00 16 05 00 00 00 02 00 00*18"), 26));  // the other way round
}

TEST(AppleSingleTest, AFileWithoutEntriesIsOne) {
    const auto file = DecodeAppleSingle(Hex("00 05 16 00 00 02 00 00 00*18"), 26);
    ASSERT_TRUE(file);
    EXPECT_EQ(0, file->entry_count());
    EXPECT_FALSE(file->Find(1));
}

TEST(AppleSingleTest, DataLiesWithinTheFile) {
    EXPECT_FALSE(DecodeAppleSingle(kHead, kFileSize - 1));
    Bytes head = kHead;
    std::fill_n(head.begin() + 54, 8, 0xFF);  // ends beyond 4 GiB
    EXPECT_FALSE(DecodeAppleSingle(head, kFileSize));
    EXPECT_FALSE(DecodeAppleSingle(head, 0x1FFFFFFFDU));
    EXPECT_TRUE(DecodeAppleSingle(head, 0x1FFFFFFFEU));
}

TEST(AppleSingleTest, AnyDamageLeavesDataWithinTheFileOrNone) {
    ForEachDamage(kHead, [](const Bytes& head) {
        const auto file = DecodeAppleSingle(head, kFileSize);
        if (head.size() < kHead.size()) {
            ASSERT_FALSE(file);
        }
        if (!file) return;
        ASSERT_LE(26 + 12U * file->entry_count(), head.size());
        for (std::uint16_t index = 0; index < file->entry_count(); ++index) {
            const SingleEntry entry = file->entry(index);
            ASSERT_LE(entry.data.end(), kFileSize);
            ASSERT_TRUE(file->Find(entry.id));
        }
    });
}

TEST(AppleSingleTest, FilesOfOtherProgramsAreRead) {
    const std::vector<SampleFile> samples = SampleFiles();
    if (samples.empty()) GTEST_SKIP() << kNoSampleFiles;
    for (const SampleFile& sample : samples) {
        SCOPED_TRACE(sample.name);
        const auto file = DecodeAppleSingle(sample.bytes, sample.bytes.size());
        ASSERT_EQ(sample.name.ends_with("applesingle_hello__.as.bin"), file.has_value());
        if (!file) continue;
        EXPECT_EQ(5, file->entry_count());
        ExpectEntry(*file, kSingleRealName, {86, 11});
        ExpectEntry(*file, kSingleFileDates, {97, 16});
        ExpectEntry(*file, kSingleDataFork, {153, 14});
    }
}

TEST(AppleSingleTest, AHeadPutsDataOneBehindTheOther) {
    std::vector<SingleEntry> entries = {{3, {0, 5}}, {9, {0, 32}}, {1, {0xEEEEEEEE, 65536}}};
    Bytes head(62, 0xEE);
    EXPECT_TRUE(EncodeAppleSingleHead(entries, head));
    EXPECT_THAT(head, ElementsAreArray(kHead));
    EXPECT_EQ((Range{62, 5}), entries[0].data);
    EXPECT_EQ((Range{67, 32}), entries[1].data);
    EXPECT_EQ((Range{99, 65536}), entries[2].data);
}

TEST(AppleSingleTest, WhatEndsBeyond32BitsHasNoHead) {
    Bytes head(50);
    std::vector<SingleEntry> entries = {{1, {0, 0xFFFFFF00}}, {2, {0, 0xCD}}};
    EXPECT_TRUE(EncodeAppleSingleHead(entries, head));
    entries[1].data.length = 0xCE;
    EXPECT_FALSE(EncodeAppleSingleHead(entries, head));
    entries[1].data.length = 0xFFFFFFFF;
    EXPECT_FALSE(EncodeAppleSingleHead(entries, head));
}

TEST(AppleSingleTest, AHeadHasTheSizeOfItsEntries) {
    std::vector<SingleEntry> entries = {{1, {}}, {2, {}}};
    Bytes small(49);
    EXPECT_FALSE(EncodeAppleSingleHead(entries, small));
    Bytes large(51);
    EXPECT_FALSE(EncodeAppleSingleHead(entries, large));
    entries.resize(65535);
    Bytes most(26 + 12 * 65535);
    EXPECT_TRUE(EncodeAppleSingleHead(entries, most));
    entries.resize(65536);
    Bytes wrapped(26);
    EXPECT_FALSE(EncodeAppleSingleHead(entries, wrapped));
}

}  // namespace
}  // namespace mavoea::test

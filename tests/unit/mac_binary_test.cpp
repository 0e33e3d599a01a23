// The bytes of MacBinary headers. Another program that unpacks such files takes those of version 3.

#include "format/mac_binary.h"

#include <gmock/gmock.h>

#include <string>

#include "format/crc16.h"
#include "tests/support/damage.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAreArray;

const Bytes kVersion3 =
    Hex("00 "                     //   0
        "0A 'letter.txt' 00*53 "  //   1  name
        "'TEXTttxt' "             //  65  type, creator
        "40 "                     //  73  Finder flags, high byte
        "00 "                     //  74
        "00 01 00 02 00 03 "      //  75  place, folder
        "01 "                     //  81  locked
        "00 "                     //  82
        "00 00 00 11 "            //  83  data fork
        "00 00 00 B4 "            //  87  resource fork
        "B0 00 00 01 "            //  91  creation
        "B0 00 00 02 "            //  95  modification
        "00 00 "                  //  99  comment
        "01 "                     // 101  Finder flags, low byte
        "'mBIN' "                 // 102
        "7E 81 "                  // 106  script, extended flags
        "00*8 00*4 "              // 108
        "00 00 "                  // 120  second header
        "82 81 "                  // 122  version
        "0D CC "                  // 124  checksum
        "00 00");                 // 126
constexpr std::uint64_t kFileSize = 512;

// With these bytes at `at`, and a right checksum.
Bytes With(Bytes head, std::size_t at, const Bytes& others) {
    std::copy(others.begin(), others.end(), head.begin() + static_cast<std::ptrdiff_t>(at));
    const std::uint16_t crc = Crc16(ByteView(head).first(124));
    head[124] = static_cast<std::uint8_t>(crc >> 8);
    head[125] = static_cast<std::uint8_t>(crc);
    return head;
}

// As version 1 has it: nothing from 101 on.
Bytes Version1() {
    Bytes head = kVersion3;
    std::fill(head.begin() + 101, head.end(), std::uint8_t{0});
    return head;
}

// ---- Decoding -----------------------------------------------------------------------------------

TEST(MacBinaryTest, AHeadOfVersion3TellsAll) {
    const auto file = DecodeMacBinary(kVersion3, kFileSize);
    ASSERT_TRUE(file);
    EXPECT_EQ(3, file->version);
    EXPECT_EQ("letter.txt", file->head.name);
    EXPECT_THAT(file->head.finder_info,
                ElementsAreArray(Hex("'TEXTttxt' 40 01 00 01 00 02 00 03 00*8 7E 81 00*6")));
    EXPECT_TRUE(file->head.locked);
    EXPECT_EQ(0xB0000001U, file->head.creation_time);
    EXPECT_EQ(0xB0000002U, file->head.modification_time);
    EXPECT_EQ(17U, file->head.data_length);
    EXPECT_EQ(180U, file->head.resource_length);
    EXPECT_EQ(0U, file->head.comment_length);
    EXPECT_EQ(128U, file->data_offset);
    EXPECT_EQ(256U, file->resource_offset);
    EXPECT_EQ(512U, file->comment_offset);
}

TEST(MacBinaryTest, Version2HasNoScript) {
    const auto file = DecodeMacBinary(With(kVersion3, 102, Hex("'mBIX' 7E 81")), kFileSize);
    ASSERT_TRUE(file);
    EXPECT_EQ(2, file->version);
    EXPECT_THAT(file->head.finder_info,
                ElementsAreArray(Hex("'TEXTttxt' 40 01 00 01 00 02 00 03 00*16")));
}

TEST(MacBinaryTest, Version1HasHalfOfTheFlags) {
    const auto file = DecodeMacBinary(Version1(), kFileSize);
    ASSERT_TRUE(file);
    EXPECT_EQ(1, file->version);
    EXPECT_THAT(file->head.finder_info,
                ElementsAreArray(Hex("'TEXTttxt' 40 00 00 01 00 02 00 03 00*16")));
    EXPECT_EQ(180U, file->head.resource_length);
}

TEST(MacBinaryTest, WithoutItsChecksumAHeadIsOfVersion1OrNone) {
    for (std::size_t at = 101; at < 126; ++at) {
        SCOPED_TRACE(at);
        Bytes head = Version1();
        head[at] = 1;
        EXPECT_FALSE(DecodeMacBinary(head, kFileSize));
    }
    Bytes head = Version1();
    head[82] = 1;
    EXPECT_FALSE(DecodeMacBinary(head, kFileSize));
    head = Version1();
    head[126] = head[127] = 1;  // a system's own
    EXPECT_TRUE(DecodeMacBinary(head, kFileSize));
}

TEST(MacBinaryTest, TheZerosThatEveryVersionHasAreLookedAt) {
    EXPECT_FALSE(DecodeMacBinary(With(kVersion3, 0, {1}), kFileSize));
    EXPECT_FALSE(DecodeMacBinary(With(kVersion3, 74, {1}), kFileSize));
    EXPECT_TRUE(DecodeMacBinary(With(kVersion3, 82, {1}), kFileSize));
    EXPECT_FALSE(DecodeMacBinary(Bytes(128), kFileSize));
}

TEST(MacBinaryTest, ANameHas1To63Bytes) {
    EXPECT_FALSE(DecodeMacBinary(With(kVersion3, 1, {0}), kFileSize));
    EXPECT_FALSE(DecodeMacBinary(With(kVersion3, 1, {64}), kFileSize));
    const Bytes longest = With(kVersion3, 1, Bytes{63} + Bytes(63, 'n'));
    const auto file = DecodeMacBinary(longest, kFileSize);
    ASSERT_TRUE(file);
    EXPECT_EQ(std::string(63, 'n'), file->head.name);
}

TEST(MacBinaryTest, AHeadThatTakesANewerReaderIsNone) {
    EXPECT_TRUE(DecodeMacBinary(With(kVersion3, 122, {255, 129}), kFileSize));
    EXPECT_TRUE(DecodeMacBinary(With(kVersion3, 122, {130, 0}), kFileSize));
    EXPECT_FALSE(DecodeMacBinary(With(kVersion3, 122, {130, 130}), kFileSize));
}

TEST(MacBinaryTest, AllPartsLieBehindASecondHeader) {
    const Bytes head = With(With(kVersion3, 120, Hex("00 81")), 99, Hex("00 0A"));
    const auto file = DecodeMacBinary(head, 128 + 256 + 128 + 256 + 10);
    ASSERT_TRUE(file);
    EXPECT_EQ(384U, file->data_offset);
    EXPECT_EQ(512U, file->resource_offset);
    EXPECT_EQ(768U, file->comment_offset);
    EXPECT_EQ(10U, file->head.comment_length);
    EXPECT_FALSE(DecodeMacBinary(head, 128 + 256 + 128 + 256 + 9));
}

TEST(MacBinaryTest, TheLastPaddingMayBeMissing) {
    EXPECT_TRUE(DecodeMacBinary(kVersion3, 256 + 180));
    EXPECT_FALSE(DecodeMacBinary(kVersion3, 256 + 179));
    const Bytes data_only = With(kVersion3, 87, Bytes(4));
    EXPECT_TRUE(DecodeMacBinary(data_only, 128 + 17));
    EXPECT_FALSE(DecodeMacBinary(data_only, 128 + 16));
    const Bytes nothing = With(kVersion3, 83, Bytes(8));
    EXPECT_TRUE(DecodeMacBinary(nothing, 128));
    EXPECT_FALSE(DecodeMacBinary(nothing, 127));
}

TEST(MacBinaryTest, ForksHave31Bits) {
    const auto file =
        DecodeMacBinary(With(kVersion3, 83, Hex("7F FF FF FF 7F FF FF FF")), 0x100000100);
    ASSERT_TRUE(file);
    EXPECT_EQ(0x80000080U, file->resource_offset);
    EXPECT_EQ(0x100000080U, file->comment_offset);
    EXPECT_FALSE(DecodeMacBinary(With(kVersion3, 83, Hex("80 00 00 00")), UINT64_MAX));
    EXPECT_FALSE(DecodeMacBinary(With(kVersion3, 87, Hex("80 00 00 00")), UINT64_MAX));
}

TEST(MacBinaryTest, AnyDamageLeavesPartsWithinTheFileOrNone) {
    for (const Bytes& whole : {kVersion3, Version1()}) {
        ForEachDamage(whole, [](const Bytes& head) {
            const auto file = DecodeMacBinary(head, kFileSize);
            if (head.size() < 128) {
                ASSERT_FALSE(file);
            }
            if (!file) return;
            const MacBinaryHead& info = file->head;
            ASSERT_TRUE(info.name.size() >= 1 && info.name.size() <= 63);
            ASSERT_TRUE(info.data_length == 0 || file->data_offset + info.data_length <= kFileSize);
            ASSERT_TRUE(info.resource_length == 0 ||
                        file->resource_offset + info.resource_length <= kFileSize);
        });
    }
}

TEST(MacBinaryTest, AnyOtherByteUnderTheChecksumIsNoticed) {
    for (std::size_t at = 0; at < 126; ++at) {
        SCOPED_TRACE(at);
        Bytes head = kVersion3;
        head[at] ^= 0x10;
        EXPECT_FALSE(DecodeMacBinary(head, kFileSize));
    }
}

// ---- Encoding -----------------------------------------------------------------------------------

TEST(MacBinaryTest, AHeadOfVersion3HasThese128Bytes) {
    MacBinaryHead head{.name = "letter.txt",
                       .finder_info = {},
                       .locked = true,
                       .creation_time = 0xB0000001,
                       .modification_time = 0xB0000002,
                       .data_length = 17,
                       .resource_length = 180,
                       .comment_length = 0};
    const Bytes info = Hex("'TEXTttxt' 40 01 00 01 00 02 00 03 EE*8 7E 81 EE*6");
    std::copy(info.begin(), info.end(), head.finder_info.begin());
    const auto bytes = EncodeMacBinaryHead(head);
    ASSERT_TRUE(bytes);
    EXPECT_THAT(*bytes, ElementsAreArray(kVersion3));

    head.locked = false;
    head.comment_length = 0x1234;
    const auto others = EncodeMacBinaryHead(head);
    ASSERT_TRUE(others);
    EXPECT_THAT(*others, ElementsAreArray(With(With(kVersion3, 81, {0}), 99, Hex("12 34"))));
}

TEST(MacBinaryTest, WhatHasNoPlaceHasNoHead) {
    const std::string name(64, 'n');
    MacBinaryHead head{.name = name};
    EXPECT_FALSE(EncodeMacBinaryHead(head));
    head.name.remove_suffix(1);
    EXPECT_TRUE(EncodeMacBinaryHead(head));
    head.data_length = head.resource_length = 0x7FFFFFFF;
    EXPECT_TRUE(EncodeMacBinaryHead(head));
    head.data_length = 0x80000000;
    EXPECT_FALSE(EncodeMacBinaryHead(head));
    head.data_length = 0;
    head.resource_length = 0x80000000;
    EXPECT_FALSE(EncodeMacBinaryHead(head));
    EXPECT_FALSE(EncodeMacBinaryHead({}));
}

}  // namespace
}  // namespace mavoea::test

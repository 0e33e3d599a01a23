// The bytes of "AFP_AfpInfo" streams.

#include "format/afp_info.h"

#include <gmock/gmock.h>

#include "tests/support/damage.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAreArray;

const Bytes kStream =
    Hex("'AFP' 00 "           //  0  signature
        "00 00 01 00 "        //  4  version
        "00*4 "               //  8  reserved
        "2A 3B 4C 5D "        // 12  backup time
        "'TEXTttxt' 40 00 "   // 16  Finder info: type, creator, flags
        "00*6 00*15 7F "      // 26
        "00 04 00 00 20 00 "  // 48  ProDOS info
        "00*6");              // 54  reserved

TEST(AfpInfoTest, AStreamHasTheseSixtyBytes) {
    AfpInfo info{
        .backup_time = 0x2A3B4C5D, .finder_info = {}, .prodos_info = {0, 4, 0, 0, 0x20, 0}};
    const Bytes finder_info = Hex("'TEXTttxt' 40 00 00*21 7F");
    ASSERT_EQ(32U, finder_info.size());
    std::copy(finder_info.begin(), finder_info.end(), info.finder_info.begin());
    EXPECT_THAT(EncodeAfpInfo(info), ElementsAreArray(kStream));

    const auto decoded = DecodeAfpInfo(kStream);
    ASSERT_TRUE(decoded);
    EXPECT_EQ(0x2A3B4C5DU, decoded->backup_time);
    EXPECT_THAT(decoded->finder_info, ElementsAreArray(finder_info));
    EXPECT_THAT(decoded->prodos_info, ElementsAreArray({0, 4, 0, 0, 0x20, 0}));
}

TEST(AfpInfoTest, AFreshOneHasNoBackupTime) {
    EXPECT_THAT(EncodeAfpInfo({}),
                ElementsAreArray(Hex("'AFP' 00 00 00 01 00 00*4 80 00 00 00 00*44")));
}

TEST(AfpInfoTest, WhatIsReservedMayBeAnything) {
    Bytes bytes = kStream;
    std::fill_n(bytes.begin() + 8, 4, 0xEE);
    std::fill_n(bytes.begin() + 54, 6, 0xEE);
    const auto decoded = DecodeAfpInfo(bytes);
    ASSERT_TRUE(decoded);
    EXPECT_THAT(EncodeAfpInfo(*decoded), ElementsAreArray(kStream));
}

TEST(AfpInfoTest, AnotherSizeSignatureOrVersionIsNone) {
    EXPECT_FALSE(DecodeAfpInfo(kStream + Bytes{0}));
    ForEachDamage(kStream, [](const Bytes& bytes) {
        const bool head = std::equal(bytes.begin(),
                                     bytes.begin() + std::min<long>(8, bytes.end() - bytes.begin()),
                                     kStream.begin());
        const auto decoded = DecodeAfpInfo(bytes);
        ASSERT_EQ(bytes.size() == kStream.size() && head, decoded.has_value());
        if (!decoded) return;
        const auto encoded = EncodeAfpInfo(*decoded);
        EXPECT_TRUE(std::equal(bytes.begin() + 12, bytes.begin() + 54, encoded.begin() + 12));
    });
}

}  // namespace
}  // namespace mavoea::test

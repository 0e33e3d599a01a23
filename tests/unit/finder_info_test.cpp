// The bytes of Finder info.

#include "format/finder_info.h"

#include <gmock/gmock.h>

#include "tests/support/damage.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAreArray;

const Bytes kFile =
    Hex("'TEXT' "       //  0  type
        "'ttxt' "       //  4  creator
        "48 0D "        //  8  flags: invisible, stationery, red, on desk
        "00 14 FF F0 "  // 10  20 down, -16 across
        "12 34 "        // 14  window
        "A1 A2 A3 A4 "  // 16  reserved
        "A5 A6 A7 A8 "  // 20  reserved
        "80 01 "        // 24  extended flags
        "23 45 "        // 26  comment
        "FF FF FF FE"   // 28  put away
    );
const Bytes kFolder =
    Hex("00 28 FF C4 "  //  0  window: top 40, left -60
        "01 90 02 58 "  //  4  bottom 400, right 600
        "04 02 "        //  8  flags: custom icon, grey
        "FF FF 00 64 "  // 10  -1 down, 100 across
        "01 00 "        // 14  view
        "00 05 FF FA "  // 16  scrolled 5 down, -6 across
        "A5 A6 A7 A8 "  // 20  reserved
        "00 80 "        // 24  extended flags
        "00 00 "        // 26  comment
        "00 00 00 02"   // 28  put away
    );

FinderInfoView View(const Bytes& bytes) { return FinderInfoView(bytes.data(), kFinderInfoSize); }

TEST(FinderInfoTest, AFileHasTheseBytes) {
    const FileFinderInfo info = DecodeFileFinderInfo(View(kFile));
    EXPECT_THAT(info.type, ElementsAreArray(Ascii("TEXT")));
    EXPECT_THAT(info.creator, ElementsAreArray(Ascii("ttxt")));
    EXPECT_EQ(kFinderInvisible | kFinderStationery | 6 << 1 | kFinderOnDesk, info.item.flags);
    EXPECT_EQ(6, info.item.label());
    EXPECT_EQ((FinderPoint{20, -16}), info.item.place);
    EXPECT_EQ(0x1234, info.item.window);
    EXPECT_THAT(info.reserved, ElementsAreArray(Hex("A1 A2 A3 A4")));
    EXPECT_THAT(info.item.reserved, ElementsAreArray(Hex("A5 A6 A7 A8")));
    EXPECT_EQ(0x8001, info.item.extended_flags);
    EXPECT_EQ(0x2345, info.item.comment);
    EXPECT_EQ(-2, info.item.put_away);
    EXPECT_THAT(EncodeFinderInfo(info), ElementsAreArray(kFile));
}

TEST(FinderInfoTest, AFolderHasTheseBytes) {
    const FolderFinderInfo info = DecodeFolderFinderInfo(View(kFolder));
    EXPECT_EQ((FinderPoint{40, -60}), info.window_begin);
    EXPECT_EQ((FinderPoint{400, 600}), info.window_end);
    EXPECT_EQ(kFinderCustomIcon | 1 << 1, info.item.flags);
    EXPECT_EQ(1, info.item.label());
    EXPECT_EQ((FinderPoint{-1, 100}), info.item.place);
    EXPECT_EQ(0x0100, info.item.window);
    EXPECT_EQ((FinderPoint{5, -6}), info.scrolled);
    EXPECT_THAT(info.item.reserved, ElementsAreArray(Hex("A5 A6 A7 A8")));
    EXPECT_EQ(0x0080, info.item.extended_flags);
    EXPECT_EQ(0, info.item.comment);
    EXPECT_EQ(2, info.item.put_away);
    EXPECT_THAT(EncodeFinderInfo(info), ElementsAreArray(kFolder));
}

TEST(FinderInfoTest, ALabelChangesItsThreeBitsOnly) {
    for (const unsigned flags : {0x0000U, 0xFFFFU, 0x5A5AU}) {
        for (std::uint8_t label = 0; label < 8; ++label) {
            FinderItem item;
            item.flags = static_cast<std::uint16_t>(flags);
            item.SetLabel(label);
            EXPECT_EQ(label, item.label());
            EXPECT_EQ(flags & 0xFFF1U, item.flags & 0xFFF1U);
        }
    }
}

TEST(FinderInfoTest, WhateverItHoldsComesBackAsItWas) {
    for (const Bytes& whole : {kFile, kFolder}) {
        ForEachDamage(whole, [](const Bytes& bytes) {
            if (bytes.size() != kFinderInfoSize) return;  // there is no view of it
            EXPECT_THAT(EncodeFinderInfo(DecodeFileFinderInfo(View(bytes))),
                        ElementsAreArray(bytes));
            EXPECT_THAT(EncodeFinderInfo(DecodeFolderFinderInfo(View(bytes))),
                        ElementsAreArray(bytes));
        });
    }
}

}  // namespace
}  // namespace mavoea::test

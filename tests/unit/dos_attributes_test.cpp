// The bytes of Samba's DOS attributes. Those of versions 1 to 5 are what its own library packs, and
// what its smbd made of every case is what is expected here.

#include "platform/dos_attributes.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

#include "tests/support/damage.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAreArray;

constexpr std::uint64_t kTime = 0x01DD79132202DA28;  // 2026-11-20

const Bytes kVersion1 =
    Hex("'0x23' 00 00 "              //  0  text, padding
        "01 00 01 00 00 00 "         //  6  version, twice, padding
        "23 00 00 00 "               // 12  attributes
        "44 33 22 11 "               // 16  EA size
        "08 07 06 05 04 03 02 01 "   // 20  size
        "18 17 16 15 14 13 12 11 "   // 28  allocated size
        "28 DA 02 22 13 79 DD 01 "   // 36  creation time
        "28 27 26 25 24 23 22 21");  // 44  change time
const Bytes kVersion2 =
    Hex("'0x23' 00 00 "             //  0  text, padding
        "02 00 02 00 00 00 "        //  6  version, twice, padding
        "BB AA 00 00 "              // 12  flags
        "23 00 00 00 "              // 16  attributes
        "44 33 22 11 "              // 20  EA size
        "08 07 06 05 04 03 02 01 "  // 24  size
        "18 17 16 15 14 13 12 11 "  // 32  allocated size
        "28 DA 02 22 13 79 DD 01 "  // 40  creation time, which is not heeded
        "28 27 26 25 24 23 22 21 "  // 48  change time
        "48 47 46 45 44 43 42 41 "  // 56  write time
        "'n' 00");                  // 64  name
const Bytes kVersion3 =
    Hex("'0x23' 00 00 "              //  0  text, padding
        "03 00 03 00 00 00 "         //  6  version, twice, padding
        "11 00 00 00 "               // 12  valid flags
        "23 00 00 00 "               // 16  attributes
        "44 33 22 11 "               // 20  EA size
        "08 07 06 05 04 03 02 01 "   // 24  size
        "18 17 16 15 14 13 12 11 "   // 32  allocated size
        "28 DA 02 22 13 79 DD 01 "   // 40  creation time
        "28 27 26 25 24 23 22 21");  // 48  change time
const Bytes kVersion4 =
    Hex("00 00 04 00 04 00 00 00 "   //  0  no text, padding, version, twice, padding
        "11 00 00 00 "               //  8  valid flags
        "23 00 00 00 "               // 12  attributes
        "08 07 06 05 04 03 02 01 "   // 16  itime
        "28 DA 02 22 13 79 DD 01");  // 24  creation time
const Bytes kVersion5 =
    Hex("00 00 05 00 05 00 00 00 "   //  0  no text, padding, version, twice, padding
        "11 00 00 00 "               //  8  valid flags
        "23 00 00 00 "               // 12  attributes
        "28 DA 02 22 13 79 DD 01");  // 16  creation time

struct Version {
    const char* name;
    Bytes bytes;
    std::size_t attributes;  // where they are
    bool has_time;
};
const Version kVersions[] = {
    {"1", kVersion1, 12, true}, {"2", kVersion2, 16, false}, {"3", kVersion3, 16, true},
    {"4", kVersion4, 12, true}, {"5", kVersion5, 12, true},
};

Bytes With(Bytes bytes, std::size_t at, const Bytes& others) {
    std::copy(others.begin(), others.end(), bytes.begin() + static_cast<std::ptrdiff_t>(at));
    return bytes;
}

void ExpectDecoded(const Bytes& bytes, std::uint32_t attributes,
                   std::optional<std::uint64_t> creation_time) {
    const auto decoded = DecodeDosAttributes(bytes);
    ASSERT_TRUE(decoded);
    EXPECT_EQ(attributes, decoded->attributes);
    EXPECT_EQ(creation_time, decoded->creation_time);
}

// ---- Decoding -----------------------------------------------------------------------------------

TEST(DosAttributesTest, EachVersionTellsAttributesAndCreationTime) {
    for (const Version& version : kVersions) {
        SCOPED_TRACE(version.name);
        ExpectDecoded(version.bytes, 0x23, version.has_time ? std::optional(kTime) : std::nullopt);
    }
}

TEST(DosAttributesTest, ACreationTimeIsOneOnlyWhereTheFlagsSaySo) {
    for (const Bytes& flags : {Hex("01 00 00 00"), Hex("00*4"), Hex("EF FF FF FF")}) {
        ExpectDecoded(With(kVersion3, 12, flags), 0x23, std::nullopt);
        ExpectDecoded(With(kVersion4, 8, flags), 0x23, std::nullopt);
        ExpectDecoded(With(kVersion5, 8, flags), 0x23, std::nullopt);
    }
    ExpectDecoded(With(kVersion5, 8, Hex("10 00 00 00")), 0x23, kTime);
    ExpectDecoded(With(kVersion5, 8, Hex("FF*4")), 0x23, kTime);
}

TEST(DosAttributesTest, ATimeOfZerosIsNone) {
    ExpectDecoded(With(kVersion1, 36, Bytes(8)), 0x23, std::nullopt);
    ExpectDecoded(With(kVersion3, 40, Bytes(8)), 0x23, std::nullopt);
    ExpectDecoded(With(kVersion4, 24, Bytes(8)), 0x23, std::nullopt);
    ExpectDecoded(With(kVersion5, 16, Bytes(8)), 0x23, std::nullopt);
}

TEST(DosAttributesTest, TheTextMayHaveAnyLengthAndFieldsAreAlignedBehindIt) {
    ExpectDecoded(Hex("'0x1' 00 05 00 05 00 11 00 00 00 22 00 00 00 28 DA 02 22 13 79 DD 01"), 0x22,
                  kTime);
    ExpectDecoded(
        Hex("'0x123' 00 05 00 05 00 00 00 11 00 00 00 22 00 00 00 28 DA 02 22 13 79 DD 01"), 0x22,
        kTime);
    ExpectDecoded(
        Hex("'0x12' 00 EE 05 00 05 00 EE EE 11 00 00 00 22 00 00 00 28 DA 02 22 13 79 DD 01"), 0x22,
        kTime);
}

TEST(DosAttributesTest, BytesBehindAValueAreIgnored) {
    for (const Version& version : kVersions) {
        SCOPED_TRACE(version.name);
        const auto decoded = DecodeDosAttributes(version.bytes + Hex("EE EE"));
        ASSERT_TRUE(decoded);
        EXPECT_EQ(0x23U, decoded->attributes);
    }
}

TEST(DosAttributesTest, TextAloneTellsAttributes) {
    struct Case {
        std::string text;
        std::uint32_t attributes;
    };
    for (const Case& c : std::vector<Case>{{"0x22", 0x22},
                                           {"0X22", 0x22},
                                           {"22", 0x22},
                                           {"0x00000022", 0x22},
                                           {"0x22x", 0x22},
                                           {"0x1", 1},
                                           {"0", 0},
                                           {"0x", 0},
                                           {"0xAbCdEf01", 0xABCDEF01},
                                           {"0xFFFFFFFF", 0xFFFFFFFF},
                                           {"0xffffffff", 0xFFFFFFFF}}) {
        SCOPED_TRACE(c.text);
        ExpectDecoded(Ascii(c.text), c.attributes, std::nullopt);
        ExpectDecoded(Ascii(c.text) + Bytes{0}, c.attributes, std::nullopt);
    }
}

TEST(DosAttributesTest, WhatIsNoValueTellsNothing) {
    for (const std::string text : {"", "x22", "-0x22", " 22", "0x100000000", "hidden"}) {
        SCOPED_TRACE(text);
        EXPECT_FALSE(DecodeDosAttributes(Ascii(text)));
        EXPECT_FALSE(DecodeDosAttributes(Ascii(text) + Bytes{0}));
    }
    EXPECT_FALSE(DecodeDosAttributes(Hex("'0x22' 00 00")));
    EXPECT_FALSE(DecodeDosAttributes(With(kVersion5, 2, Hex("06 00 06 00"))));
    EXPECT_FALSE(DecodeDosAttributes(With(kVersion5, 2, Hex("00 00 00 00"))));
    EXPECT_FALSE(DecodeDosAttributes(With(kVersion5, 2, Hex("05 00 04 00"))));
    EXPECT_FALSE(DecodeDosAttributes(With(kVersion5, 2, Hex("05 01 05 01"))));
}

TEST(DosAttributesTest, WhatIsCutShortTellsNothing) {
    for (const Version& version : kVersions) {
        for (std::size_t size = 0; size < version.bytes.size(); ++size) {
            SCOPED_TRACE(std::string(version.name) + " of " + std::to_string(size));
            const Bytes bytes(version.bytes.begin(),
                              version.bytes.begin() + static_cast<std::ptrdiff_t>(size));
            // A text is a value of its own.
            const bool text = size > 0 && bytes[0] != 0 && size <= 5;
            EXPECT_EQ(text || (version.bytes == kVersion2 && size == 65),
                      DecodeDosAttributes(bytes).has_value());
        }
    }
}

// ---- Changing -----------------------------------------------------------------------------------

TEST(DosAttributesTest, AttributesAreChangedInPlace) {
    for (const Version& version : kVersions) {
        SCOPED_TRACE(version.name);
        const Bytes before = version.bytes + Hex("EE EE");
        Bytes bytes = before;
        EXPECT_TRUE(SetDosAttributes(bytes, 0x89ABCDEF));
        EXPECT_EQ(With(before, version.attributes, Hex("EF CD AB 89")), bytes);
    }
}

TEST(DosAttributesTest, ChangedAttributesAreValid) {
    for (const auto& [version, at] :
         {std::pair(kVersion3, 12UL), std::pair(kVersion4, 8UL), std::pair(kVersion5, 8UL)}) {
        Bytes bytes = With(version, at, Hex("50 60 70 80"));
        EXPECT_TRUE(SetDosAttributes(bytes, 0x20));
        EXPECT_EQ(With(version, at, Hex("51 60 70 80 20 00 00 00")), bytes);
    }
}

TEST(DosAttributesTest, WhatIsOnlyTextOrUnknownIsLeftAsItIs) {
    for (const Bytes& before :
         {Bytes{}, Ascii("0x22"), Hex("'0x22' 00"), With(kVersion5, 2, Hex("06 00 06 00")),
          With(kVersion5, 4, Hex("04 00")), Bytes(kVersion5.begin(), kVersion5.end() - 1)}) {
        Bytes bytes = before;
        EXPECT_FALSE(SetDosAttributes(bytes, 0x23));
        EXPECT_EQ(before, bytes);
    }
}

TEST(DosAttributesTest, AnyDamageLeavesWhatIsReadAndWhatIsChangedInAgreement) {
    for (const Version& version : kVersions) {
        SCOPED_TRACE(version.name);
        ForEachDamage(version.bytes, [](const Bytes& damaged) {
            const auto before = DecodeDosAttributes(damaged);
            Bytes bytes = damaged;
            if (!SetDosAttributes(bytes, 0x35)) {
                ASSERT_EQ(damaged, bytes);
                return;
            }
            const auto after = DecodeDosAttributes(bytes);
            ASSERT_TRUE(before && after);
            ASSERT_EQ(0x35U, after->attributes);
            ASSERT_EQ(before->creation_time, after->creation_time);
        });
    }
}

// ---- Encoding -----------------------------------------------------------------------------------

TEST(DosAttributesTest, AFreshValueIsOfVersion5) {
    EXPECT_THAT(EncodeDosAttributes({.attributes = 0x23, .creation_time = kTime}),
                ElementsAreArray(kVersion5));
}

TEST(DosAttributesTest, AFreshValueWithoutACreationTimeDoesNotTellOne) {
    EXPECT_THAT(EncodeDosAttributes({.attributes = 0x89ABCDEF, .creation_time = {}}),
                ElementsAreArray(Hex("00 00 05 00 05 00 00 00 01 00 00 00 EF CD AB 89 00*8")));
}

TEST(DosAttributesTest, OfMoreThan256BytesThereAreNone) {
    Bytes bytes = kVersion5;
    bytes.resize(256);
    ExpectDecoded(bytes, 0x23, kTime);
    bytes.resize(257);
    EXPECT_FALSE(DecodeDosAttributes(bytes));
}

}  // namespace
}  // namespace mavoea::test

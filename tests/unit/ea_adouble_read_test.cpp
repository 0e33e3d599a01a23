// Parsing netatalk metadata blocks.

#include <gmock/gmock.h>

#include <cstring>
#include <string>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/record_builder.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class AdoubleReadTest : public ::testing::Test {
 protected:
    AdoubleReadTest() { ResetPlatform(); }
    ~AdoubleReadTest() override {
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_THAT(TakeLog(), IsEmpty());
    }

    int Read(const Bytes& block) {
        ad_ = {};
        return MAVOEAAdoubleRead(block.data(), static_cast<int>(block.size()), &ad_);
    }
    void ExpectRejected(const Bytes& block, const std::string& entry) {
        SCOPED_TRACE(entry);
        EXPECT_EQ(-1, Read(block));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_adouble_read")));
        EXPECT_THAT(TakeLog(),
                    ElementsAre("ea_adouble_read:LINE AdoubleEntriesParse: wrong " + entry));
    }

    EAAdouble ad_ = {};
};

// Promise: "offset: into the record's data"
// Promise: "length: in bytes"
// Promise: "magic: host order"
// Promise: "version: host order"
// Promise: "data: the block as on disk"
// Promise: "MAVOEAAdoubleRead: Parses"
// Promise: "entries: ids 1 to 15"
// Promise: "Netatalk record: netatalk has four"
// Promise: "Netatalk record: comment |"
// Promise: "Netatalk record: file dates |"
// Promise: "Netatalk record: Finder info |"
// Promise: "Netatalk record: AFP file info |"
// Promise: "Netatalk record: private device |"
// Promise: "Netatalk record: private inode |"
// Promise: "Netatalk record: private sync |"
// Promise: "Netatalk record: private id |"
TEST_F(AdoubleReadTest, EveryEntryOfAnAttributeRecordIsInItsSlot) {
    const Bytes block = AttributeRecord();
    ASSERT_EQ(402u, block.size());
    ASSERT_EQ(0, Read(block));
    EXPECT_EQ(0x00051607u, ad_.magic);
    EXPECT_EQ(0x00020000u, ad_.version);
    const struct {
        int slot;
        std::int64_t offset;
        std::uint32_t length;
    } expected[] = {{4, 154, 0},  {8, 354, 16}, {9, 122, 32}, {14, 370, 4},
                    {16, 374, 0}, {17, 382, 0}, {18, 390, 0}, {19, 398, 0}};
    int present = 0;
    for (const EAAdoubleEntry& entry : ad_.entries) present += entry.offset != 0 ? 1 : 0;
    EXPECT_EQ(8, present);
    for (const auto& entry : expected) {
        SCOPED_TRACE(entry.slot);
        EXPECT_EQ(entry.offset, ad_.entries[entry.slot].offset);
        EXPECT_EQ(entry.length, ad_.entries[entry.slot].length);
    }
    EXPECT_EQ(0, memcmp(ad_.data, block.data(), block.size()));
    EXPECT_EQ(0, ad_.data[402]);
}

TEST_F(AdoubleReadTest, TheFillerIsLeftAlone) {
    Bytes block = AttributeRecord();
    std::fill_n(block.begin() + 8, 16, std::uint8_t{0x55});
    ad_.filler[3] = 7;
    ASSERT_EQ(0, MAVOEAAdoubleRead(block.data(), 402, &ad_));
    EXPECT_EQ(0, ad_.filler[0]);
    EXPECT_EQ(7, ad_.filler[3]);
}

// Promise: "MAVOEAAdoubleRead: 0, or -1"
TEST_F(AdoubleReadTest, NullAndLengthsOutsideTheDataAreBadArguments) {
    const Bytes block = Repeat(0x77, 1025);
    EXPECT_EQ(-1, MAVOEAAdoubleRead(nullptr, 402, &ad_));
    EXPECT_EQ(-1, MAVOEAAdoubleRead(block.data(), 402, nullptr));
    EXPECT_EQ(-1, MAVOEAAdoubleRead(block.data(), 1025, &ad_));
    EXPECT_EQ(-1, MAVOEAAdoubleRead(block.data(), -1, &ad_));
    EXPECT_THAT(
        TakeRecords(),
        ElementsAre(RecordOf(0xD00, "ea_adouble_read"), RecordOf(0xD00, "ea_adouble_read"),
                    RecordOf(0xD00, "ea_adouble_read"), RecordOf(0xD00, "ea_adouble_read")));
    EXPECT_EQ(0, ad_.data[0]);  // Nothing was copied.
}

TEST_F(AdoubleReadTest, ABlockOf1024BytesIsTakenWhole) {
    EXPECT_EQ(0, Read(OneEntry(9, 992, 32, 1024)));
    EXPECT_EQ(992, ad_.entries[9].offset);
}

// Promise: "MAVOEAAdoubleRead: 0xA00"
TEST_F(AdoubleReadTest, AnotherMagicOrVersionIsRefused) {
    Bytes block = AttributeRecord();
    block[5] = 1;  // AppleDouble version 1
    EXPECT_EQ(-1, Read(block));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_adouble_read")));
    EXPECT_THAT(TakeLog(),
                ElementsAre("ea_adouble_read:LINE ad magic[333319] and ad version[65536] error"));
    EXPECT_EQ(0x00010000u, ad_.version);
    EXPECT_EQ(0, ad_.entries[9].offset);

    block = AttributeRecord();
    block[3] = 0;  // AppleSingle's
    EXPECT_EQ(-1, Read(block));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_adouble_read")));
    EXPECT_THAT(TakeLog(),
                ElementsAre("ea_adouble_read:LINE ad magic[333312] and ad version[131072] error"));
}

// Promise: "EAAdoubleEntry: absent when"
// Promise: "MAVOEAAdoubleRead: Parses"
TEST_F(AdoubleReadTest, ARecordWithoutEntriesSetsNoSlot) {
    EXPECT_EQ(0, Read(Hex("00 05 16 07  00 02 00 00  00*16  00 00")));
    for (const EAAdoubleEntry& entry : ad_.entries) EXPECT_EQ(0, entry.offset);
}

// Promise: "entries: ids 1 to 15"
// Promise: "Netatalk record: Ids up to 15"
TEST_F(AdoubleReadTest, StandardIdsAreTheirOwnSlots) {
    for (std::uint32_t id = 1; id <= 15; ++id) {
        SCOPED_TRACE(id);
        EXPECT_EQ(0, Read(OneEntry(id, 100 + id, id)));
        EXPECT_EQ(100 + id, ad_.entries[id].offset);
        EXPECT_EQ(id, ad_.entries[id].length);
    }
}

// Promise: "Netatalk record: netatalk has four"
TEST_F(AdoubleReadTest, OtherIdsAreRejected) {
    for (const std::uint32_t id : {0u, 16u, 19u, 20u, 0x80000000u, 0x80444557u, 0xFFFFFFFFu}) {
        ExpectRejected(OneEntry(id, 100, 5), "eid: 0, off: 100, len: 5");
        EXPECT_EQ(100, ad_.entries[0].offset);  // Stored before it was checked.
    }
}

// Promise: "MAVOEAAdoubleRead: Entries lie"
// Promise: "Netatalk record: Entries lie within"
TEST_F(AdoubleReadTest, EntriesEndWithinTheData) {
    EXPECT_EQ(0, Read(OneEntry(9, 1023, 1)));
    EXPECT_EQ(0, Read(OneEntry(9, 800, 224)));  // behind the block, inside the data
    ExpectRejected(OneEntry(9, 1024, 0), "eid: 9, off: 1024, len: 0");
    EXPECT_EQ(1024, ad_.entries[9].offset);
    ExpectRejected(OneEntry(9, 1023, 2), "eid: 9, off: 1023, len: 2");
    ExpectRejected(OneEntry(9, 741, 1000000), "eid: 9, off: 741, len: 1000000");
    ExpectRejected(OneEntry(4, 100, 0xFFFFFFFF), "eid: 4, off: 100, len: 4294967295");
    ExpectRejected(OneEntry(0x8053567E, 0xFFFFFFFF, 2), "eid: 19, off: 4294967295, len: 2");
}

// Promise: "MAVOEAAdoubleRead: Entries lie"
// Promise: "Netatalk record: only the resource fork"
TEST_F(AdoubleReadTest, OnlyTheResourceForkMayRunPastTheData) {
    EXPECT_EQ(0, Read(OneEntry(2, 741, 1000000)));
    EXPECT_EQ(741, ad_.entries[2].offset);
    EXPECT_EQ(1000000u, ad_.entries[2].length);
    EXPECT_EQ(0, Read(OneEntry(2, 1023, 0xFFFFFFFF)));
    ExpectRejected(OneEntry(2, 1024, 0), "eid: 2, off: 1024, len: 0");
}

// Promise: "MAVOEAAdoubleRead: 0, or -1"
TEST_F(AdoubleReadTest, EntriesBehindARejectedOneAreNotRead) {
    Bytes block = AttributeRecord();
    PutU32(block, 38 + 4, 1024);  // the second descriptor: comment
    ExpectRejected(block, "eid: 4, off: 1024, len: 0");
    EXPECT_EQ(122, ad_.entries[9].offset);
    EXPECT_EQ(0, ad_.entries[8].offset);
}

TEST_F(AdoubleReadTest, DescriptorsEndWithinTheData) {
    // 83 descriptors end at 26 + 83 * 12 = 1022; the 84th would end at 1034.
    Bytes block = OneEntry(9, 100, 0, 1024);
    for (std::size_t at = 26; at + 12 <= 1024; at += 12) {
        PutU32(block, at, 9);
        PutU32(block, at + 4, 100);
    }
    PutU16(block, 24, 83);
    EXPECT_EQ(0, Read(block));
    PutU16(block, 24, 84);
    ExpectRejected(block, "eid: 0, off: 0, len: 0");
    PutU16(block, 24, 0xFFFF);
    ExpectRejected(block, "eid: 0, off: 0, len: 0");
}

TEST_F(AdoubleReadTest, EveryTruncationEndsInSuccessOrARecordedCode) {
    const Bytes whole = AttributeRecord();
    for (std::size_t size = 1; size <= whole.size(); ++size) {
        SCOPED_TRACE(size);
        const Bytes block(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size));
        // A copy on the heap of exactly that size: reading past it is an error to the sanitizer.
        const int result = Read(block);
        EXPECT_EQ(result == 0 ? 0u : 1u, TakeRecords().size());
        EXPECT_EQ(result == 0 ? 0u : 1u, TakeLog().size());
        // Zeros take the place of what is missing: the version's end and the number of entries up
        // to byte 25; behind that an id, which 0 is not, up to the end of the last one at 114.
        const bool accepted = (size >= 6 && size <= 25) || size >= 114;
        EXPECT_EQ(accepted ? 0 : -1, result);
    }
}

}  // namespace
}  // namespace mavoea::test

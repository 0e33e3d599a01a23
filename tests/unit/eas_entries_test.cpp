// Finding, listing, reading, writing, removing and truncating the attributes of an open EA stream.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <functional>
#include <random>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "platform/kernel.h"
#include "stream/internal.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_fixture.h"

namespace mavoea::test {
namespace {

using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;

// The handle, its records, and three names.
constexpr int kBlocksOfThree = 5;

class EasEntriesTest : public StreamTest {
 protected:
    // A stream of three attributes and a fork, open for writing.
    void OpenThree() {
        image_ = {.attributes = {{"a", Ascii("one")}, {"b", Ascii("seconds")}, {"c", Ascii("3")}},
                  .fork = Pattern(100),
                  .finder_info = Pattern(32, 2)};
        Reopen();
    }
    void Reopen() {
        handle_.reset();
        Fill(image_);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        TakeCalls();
    }
    EASHandle* h() { return handle_.get(); }

    StreamImage image_;
    Handle handle_;
};

// ---- Search -------------------------------------------------------------------------------------

// Promise: "EA streams: attributes: Names are compared"
// Promise: "MAVOEASSearch: The index"
TEST_F(EasEntriesTest, SearchComparesByteByByte) {
    image_.attributes = {{"name", {}}, {"Name", {}}, {"names", {}}, {"nam", {}}, {"", {}}};
    Reopen();
    EXPECT_EQ(0, MAVOEASSearch(h(), "name"));
    EXPECT_EQ(1, MAVOEASSearch(h(), "Name"));
    EXPECT_EQ(2, MAVOEASSearch(h(), "names"));
    EXPECT_EQ(3, MAVOEASSearch(h(), "nam"));
    EXPECT_EQ(4, MAVOEASSearch(h(), ""));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    for (const std::string& name :
         {std::string("NAME"), std::string("na"), std::string("namesx"), std::string(300, 'n')}) {
        EXPECT_EQ(-1, MAVOEASSearch(h(), name.c_str())) << name;
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2000, "eas_search")));
        EXPECT_EQ(0x2000, MLIBCErrGet());
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

TEST_F(EasEntriesTest, SearchTellsApartNamesThatBeginOrEndAlike) {
    image_.attributes = {{"user.first.name", {}},  {"user.first.game", {}}, {"user.other.name", {}},
                         {"user.first.name.", {}}, {"ser.first.name", {}},  {"1234567", {}},
                         {"12345678", {}},         {"02345678", {}}};
    Reopen();
    for (std::size_t i = 0; i < image_.attributes.size(); ++i) {
        EXPECT_EQ(static_cast<int>(i), MAVOEASSearch(h(), image_.attributes[i].name.c_str()));
    }
    for (const char* const name : {"user.first.nam", "User.first.name", "234567", "012345678"}) {
        EXPECT_EQ(-1, MAVOEASSearch(h(), name)) << name;
    }
    // Names that a damaged table has: one that ends before its record does, one without an end.
    Bytes bytes = image_.Build();
    bytes[image_.RecordAt(0) + 11 + 12] = '\0';
    bytes[image_.RecordAt(1) + 11 + 15] = '!';
    Fill(bytes);
    handle_ = Open();
    EXPECT_EQ(0, MAVOEASSearch(h(), "user.first.n"));
    EXPECT_EQ(1, MAVOEASSearch(h(), "user.first.game!"));
    TakeRecords();
}

// Promise: "MAVOEASSearch: 0x2000"
TEST_F(EasEntriesTest, SearchInAStreamWithoutAttributesFindsNone) {
    handle_ = Open();
    EXPECT_EQ(-1, MAVOEASSearch(h(), "a"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2000, "eas_search")));
}

// Promise: "MAVOEASSearch: The index"
TEST_F(EasEntriesTest, SearchRefusesMissingArguments) {
    OpenThree();
    EXPECT_EQ(-1, MAVOEASSearch(nullptr, "a"));
    EXPECT_EQ(-1, MAVOEASSearch(h(), nullptr));
    h()->fd = -1;
    EXPECT_EQ(-1, MAVOEASSearch(h(), "a"));
    h()->fd = fd_;
    const std::vector<Record> records = TakeRecords();
    EXPECT_EQ(3u, records.size());
    EXPECT_THAT(records, Each(RecordOf(0xD00, "eas_search")));
}

// Promise: "MAVOEASSearch: The index"
TEST_F(EasEntriesTest, OfTwoRecordsWithTheSameNameTheLastIsMeant) {
    image_.attributes = {
        {"a", Ascii("first")}, {"b", Ascii("2")}, {"a", Ascii("last")}, {"c", Ascii("3")}};
    Reopen();
    EXPECT_EQ(2, MAVOEASSearch(h(), "a"));
    EXPECT_EQ(Ascii("last"), Read(handle_, "a"));
    ASSERT_EQ(1, Write(handle_, "a", "L"));
    image_.attributes = {
        {"a", Ascii("first")}, {"b", Ascii("2")}, {"c", Ascii("3")}, {"a", Ascii("Last")}};
    EXPECT_EQ(image_.Build(), Contents());
    ASSERT_EQ(0, MAVOEASRemove(h(), "a"));
    image_.attributes.pop_back();
    EXPECT_EQ(image_.Build(), Contents());
    EXPECT_EQ(Ascii("first"), Read(handle_, "a"));
    ASSERT_EQ(0, MAVOEASRemove(h(), "a"));
    EXPECT_EQ(-1, MAVOEASRemove(h(), "a"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2000, "eas_search")));
}

// ---- Enum ---------------------------------------------------------------------------------------

// Promise: "MAVOEASEnum: Appends"
TEST_F(EasEntriesTest, EnumAppendsNamesInTableOrder) {
    OpenThree();
    MLIBCSzList* list = NewList({"before"});
    EXPECT_EQ(3, MAVOEASEnum(h(), &list));
    EXPECT_THAT(Strings(list), ElementsAre("before", "a", "b", "c"));
    MLIBCSzListFree(list);
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasEntriesTest, EnumOfNoAttributesLeavesTheListAlone) {
    handle_ = Open();
    MLIBCSzList* list = NewList({"before"});
    EXPECT_EQ(0, MAVOEASEnum(h(), &list));
    EXPECT_THAT(Strings(list), ElementsAre("before"));
    MLIBCSzListFree(list);
}

// Promise: "MAVOEASEnum: -1"
TEST_F(EasEntriesTest, EnumThatCannotAppendEmptiesTheWholeList) {
    OpenThree();
    for (const int pushes : {0, 1, 2}) {
        SCOPED_TRACE(pushes);
        MLIBCSzList* list = NewList({"before"});
        Platform().pushes_until_failure = pushes;
        EXPECT_EQ(-1, MAVOEASEnum(h(), &list));
        Platform().pushes_until_failure = -1;
        EXPECT_THAT(Strings(list), IsEmpty());
        EXPECT_THAT(TakeRecords(), IsEmpty());
        MLIBCSzListFree(list);
    }
}

// Promise: "MAVOEASEnum: -1"
TEST_F(EasEntriesTest, EnumNeedsAList) {
    OpenThree();
    EXPECT_EQ(-1, MAVOEASEnum(h(), nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_enum")));
    EXPECT_EQ(-1, MAVOEASEnum(nullptr, nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_enum")));
}

// ---- Read ---------------------------------------------------------------------------------------

// Promise: "MAVOEASRead: Copies up to"
// Promise: "MAVOEASRead: With size 0"
TEST_F(EasEntriesTest, ReadCopiesWhatLiesInTheRange) {
    OpenThree();
    struct Case {
        unsigned size, offset;
        int result;
        const char* bytes;
    };
    // "seconds" has seven bytes.
    for (const Case& c :
         {Case{7, 0, 7, "seconds"}, Case{100, 0, 7, "seconds"}, Case{3, 0, 3, "sec"},
          Case{3, 2, 3, "con"}, Case{100, 5, 2, "ds"}, Case{1, 6, 1, "s"}, Case{1, 7, 0, ""},
          Case{1, 8, 0, ""}, Case{100, 0xFFFFFFFF, 0, ""}, Case{0x7FFFFFFF, 6, 1, "s"},
          Case{0xFFFFFFFF, 6, 1, "s"}, Case{0, 0, 7, ""}, Case{0, 7, 7, ""}, Case{0, 3, 7, ""},
          Case{0, 8, 0, ""}, Case{0, 0xFFFFFFFF, 0, ""}}) {
        SCOPED_TRACE(std::to_string(c.size) + " from " + std::to_string(c.offset));
        Bytes buffer = Repeat('#', 12);
        EXPECT_EQ(c.result, MAVOEASRead(h(), "b", buffer.data(), c.size, c.offset));
        Bytes expected = Ascii(c.bytes);
        expected.resize(12, '#');
        EXPECT_EQ(expected, buffer);
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasEntriesTest, ReadIsOneRead) {
    OpenThree();
    char buffer[8];
    EXPECT_EQ(4, MAVOEASRead(h(), "b", buffer, 4, 2));
    EXPECT_THAT(TakeCalls(), ElementsAre("pread(4, 173)"));  // 120 + 3 * 16 + 3 + 2
    EXPECT_EQ(0, MAVOEASRead(h(), "b", buffer, 4, 7));
    EXPECT_EQ(7, MAVOEASRead(h(), "b", buffer, 0, 0));
    EXPECT_THAT(TakeCalls(), IsEmpty());
}

// Promise: "MAVOEASRead: -1: 0xD00"
TEST_F(EasEntriesTest, ReadRefusesMissingArguments) {
    OpenThree();
    char buffer[8];
    EXPECT_EQ(-1, MAVOEASRead(nullptr, "a", buffer, 1, 0));
    EXPECT_EQ(-1, MAVOEASRead(h(), nullptr, buffer, 1, 0));
    EXPECT_EQ(-1, MAVOEASRead(h(), "a", nullptr, 1, 0));
    EXPECT_EQ(-1, MAVOEASRead(h(), "a", nullptr, 0, 0));
    h()->fd = -1;
    EXPECT_EQ(-1, MAVOEASRead(h(), "a", buffer, 1, 0));
    h()->fd = fd_;
    const std::vector<Record> records = TakeRecords();
    EXPECT_EQ(5u, records.size());
    EXPECT_THAT(records, Each(RecordOf(0xD00, "eas_read")));
}

// Promise: "MAVOEASRead: 0x2000"
TEST_F(EasEntriesTest, ReadOfAnAbsentNameLeavesTheSearchsRecord) {
    OpenThree();
    char buffer[8];
    EXPECT_EQ(-1, MAVOEASRead(h(), "z", buffer, 1, 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2000, "eas_search")));
}

// Promise: "MAVOEASRead: 0x300"
TEST_F(EasEntriesTest, ReadUnderEitherLockButNotWithout) {
    OpenThree();
    char buffer[8];
    h()->lockType = F_RDLCK;
    EXPECT_EQ(3, MAVOEASRead(h(), "a", buffer, 8, 0));
    h()->lockType = F_WRLCK;
    EXPECT_EQ(3, MAVOEASRead(h(), "a", buffer, 8, 0));
    h()->lockType = F_UNLCK;
    EXPECT_EQ(-1, MAVOEASRead(h(), "a", buffer, 0, 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x300, "eas_read")));
    h()->lockType = F_WRLCK;
}

// Promise: "MAVOEASRead: 0xA00"
TEST_F(EasEntriesTest, AShortOrFailedReadIsRecorded) {
    OpenThree();
    char buffer[8];
    {
        const FailCall fault("pread", EIO);
        EXPECT_EQ(-1, MAVOEASRead(h(), "b", buffer, 8, 0));
        EXPECT_EQ(EIO, errno);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_read")));
    }
    {
        const ShortCall fault("pread", 1, 3);
        EXPECT_EQ(-1, MAVOEASRead(h(), "b", buffer, 8, 0));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_read")));
    }
    ASSERT_EQ(0, ftruncate(fd_, 175));  // in the middle of the second value
    EXPECT_EQ(3, MAVOEASRead(h(), "a", buffer, 8, 0));
    EXPECT_EQ(-1, MAVOEASRead(h(), "b", buffer, 8, 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_read")));
    EXPECT_EQ(4, MAVOEASRead(h(), "b", buffer, 4, 0));  // these bytes are there
}

// Promise: "MAVOEASRead: Of values of 2 GiB"
// Promise: "MAVOEASRead: 0xA00"
TEST_F(EasEntriesTest, OfAValueTooLongForAResultPiecesAreRead) {
    image_.attributes = {{"a", {}}};
    for (const std::uint32_t length : {0x80000000u, 0xFFFFF000u}) {
        SCOPED_TRACE(length);
        Bytes bytes = image_.Build();
        PutU32(bytes, image_.RecordAt(0) + 4, length);
        PutU32(bytes, kDataLengthAt, length);
        Fill(bytes);
        const std::uint64_t start = image_.DataStart();
        ASSERT_EQ(0, ftruncate(fd_, static_cast<off_t>(start + length)));
        for (const std::uint64_t at : {std::uint64_t{0}, std::uint64_t{length} - 8}) {
            ASSERT_EQ(8, ::pwrite(fd_, "abcdefgh", 8, static_cast<off_t>(start + at)));
        }
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        char buffer[16] = {};
        EXPECT_EQ(4, MAVOEASRead(h(), "a", buffer, 4, 0));
        EXPECT_EQ(4, MAVOEASRead(h(), "a", buffer + 4, 4, length - 4));
        EXPECT_STREQ("abcdefgh", buffer);
        EXPECT_EQ(6, MAVOEASRead(h(), "a", buffer, sizeof buffer, length - 6));
        EXPECT_STREQ("cdefghgh", buffer);
        EXPECT_EQ(0, MAVOEASRead(h(), "a", buffer, sizeof buffer, length));
        EXPECT_THAT(TakeRecords(), IsEmpty());
        // Not its length, and not more than a result can tell.
        EXPECT_EQ(-1, MAVOEASRead(h(), "a", buffer, 0, 0));
        EXPECT_EQ(-1, MAVOEASRead(h(), "a", buffer, 0x80000000u, 0));
        EXPECT_THAT(TakeRecords(),
                    ElementsAre(RecordOf(0xA00, "eas_read"), RecordOf(0xA00, "eas_read")));
    }
}

// Promise: "EA streams: attributes: Names are compared"
// Promise: "EA streams: attributes: What would pass"
TEST_F(EasEntriesTest, AValueTooLongForAResultIsNotMade) {
    OpenThree();
    const HandleState before = StateOf(*h());
    const auto refused = [&](const char* unit, int result) {
        EXPECT_EQ(-1, result);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, unit)));
    };
    for (const char* const name : {"b", "new"}) {
        refused("eas_write", Write(handle_, name, "", 0x80000000u));
        refused("eas_write", Write(handle_, name, "x", 0x7FFFFFFFu));
        refused("eas_write", Write(handle_, name, "xy", 0x7FFFFFFEu));
    }
    refused("eas_truncate", MAVOEASTruncate(h(), "b", 0x80000000u));
    refused("eas_truncate", MAVOEASTruncate(h(), "b", 0xC0000000u));
    EXPECT_THAT(TakeWrites(), IsEmpty());
    EXPECT_TRUE(before == StateOf(*h()));
    EXPECT_EQ(image_.Build(), Contents());
    // What is not written to has no length that could be wrong.
    EXPECT_EQ(0, Write(handle_, "b", "", 0x80000000u, 0));
    EXPECT_EQ(EEXIST, errno);
    EXPECT_EQ(-1, Write(handle_, "new", "", 0x80000000u, EAS_WRITE_MUST_EXIST));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// One that another program has made.
TEST_F(EasEntriesTest, AValueTooLongForAResultIsNotWrittenTo) {
    image_.attributes = {{"a", {}}};
    Bytes bytes = image_.Build();
    PutU32(bytes, image_.RecordAt(0) + 4, 0x80000000u);
    PutU32(bytes, kDataLengthAt, 0x80000000u);
    Fill(bytes);
    ASSERT_EQ(0, ftruncate(fd_, static_cast<off_t>(image_.DataStart() + 0x80000000ull)));
    handle_ = Open();
    ASSERT_NE(nullptr, handle_);
    EXPECT_EQ(-1, Write(handle_, "a", "x", 5));
    EXPECT_EQ(-1, MAVOEASTruncate(h(), "a", 0x80000000u));
    EXPECT_THAT(TakeCodes(), ElementsAre(0xD00, 0xD00));
    EXPECT_EQ(bytes, Contents(bytes.size()));
}

// ---- Write --------------------------------------------------------------------------------------

TEST_F(EasEntriesTest, WritingOneByteOverThreeChangesTheFirstOnly) {
    handle_ = Open();
    ASSERT_EQ(3, Write(handle_, "a", "xyz", 0, 0));
    ASSERT_EQ(1, Write(handle_, "a", "X"));
    image_.attributes = {{"a", Ascii("Xyz")}};
    EXPECT_EQ(image_.Build(), Contents());
    EXPECT_EQ(139u, FileSize());
}

// Promise: "MAVOEASWrite: A value never shrinks"
TEST_F(EasEntriesTest, ANewValueIsZeroBeforeItsOffset) {
    handle_ = Open();
    ASSERT_EQ(2, Write(handle_, "a", "ef", 4, 0));
    image_.attributes = {{"a", Hex("00*4 'ef'")}};
    EXPECT_EQ(image_.Build(), Contents());
    // Nothing written far out makes zeros too.
    ASSERT_EQ(0, Write(handle_, "b", "", 3, 0));
    image_.attributes.push_back({"b", Repeat(0, 3)});
    EXPECT_EQ(image_.Build(), Contents());
}

// Promise: "MAVOEASWrite: Writes `size`"
// Promise: "MAVOEASWrite: A value never shrinks"
// Promise: "MAVOEASWrite: Returns size"
TEST_F(EasEntriesTest, WritingInsideAtTheEndAndBeyondAValue) {
    struct Case {
        unsigned offset;
        const char* bytes;
        Bytes value;
    };
    for (const Case& c :
         {Case{2, "CO", Ascii("seCOnds")}, Case{5, "DS", Ascii("seconDS")},
          Case{6, "S!", Ascii("secondS!")}, Case{7, "!!", Ascii("seconds!!")},
          Case{9, "!", Hex("'seconds' 00 00 '!'")},
          Case{0, "SECONDS AND MORE", Ascii("SECONDS AND MORE")}, Case{0, "", Ascii("seconds")},
          Case{7, "", Ascii("seconds")}, Case{9, "", Hex("'seconds' 00 00")}}) {
        SCOPED_TRACE(std::to_string(c.offset) + " " + c.bytes);
        OpenThree();
        ASSERT_EQ(static_cast<int>(strlen(c.bytes)), Write(handle_, "b", c.bytes, c.offset));
        image_.attributes = {{"a", Ascii("one")}, {"c", Ascii("3")}, {"b", c.value}};
        EXPECT_EQ(image_.Build(), Contents(image_.End()));
        EXPECT_EQ(image_.End(), FileSize());
        EXPECT_EQ(c.value, Read(handle_, "b"));
        // Once more, now that it is the last one.
        ASSERT_EQ(static_cast<int>(strlen(c.bytes)), Write(handle_, "b", c.bytes, c.offset));
        EXPECT_EQ(image_.Build(), Contents());
        EXPECT_THAT(TakeRecords(), IsEmpty());
    }
}

// Promise: "MAVOEASWrite: The attribute becomes"
// Promise: "EA stream: The values follow"
TEST_F(EasEntriesTest, ARewrittenAttributeBecomesTheLast) {
    handle_ = Open();
    ASSERT_EQ(3, Write(handle_, "A", "aaa"));
    ASSERT_EQ(2, Write(handle_, "B", "bb"));
    ASSERT_EQ(4, Write(handle_, "C", "cccc"));
    ASSERT_EQ(2, Write(handle_, "A", "zz"));
    image_.attributes = {{"B", Ascii("bb")}, {"C", Ascii("cccc")}, {"A", Ascii("zza")}};
    EXPECT_EQ(image_.Build(), Contents());
    EXPECT_THAT(Names(handle_), ElementsAre("B", "C", "A"));
}

// Promise: "EAS_WRITE_OVERWRITE"
// Promise: "MAVOEASWrite: EEXIST"
TEST_F(EasEntriesTest, AnExistingNameIsNotWrittenWithoutTheFlag) {
    OpenThree();
    for (const int flags : {0, EAS_WRITE_MUST_EXIST + 0}) {
        SCOPED_TRACE(flags);
        errno = 0;
        EXPECT_EQ(-1, Write(handle_, "b", "x", 0, flags));
        EXPECT_EQ(EEXIST, errno);
        // Nothing to write counts as done.
        errno = 0;
        EXPECT_EQ(0, Write(handle_, "b", "", 0, flags));
        EXPECT_EQ(EEXIST, errno);
        errno = 0;
        EXPECT_EQ(0, MAVOEASWrite(h(), "b", nullptr, 0, 50, flags));
        EXPECT_EQ(EEXIST, errno);
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_THAT(TakeWrites(), IsEmpty());
    EXPECT_EQ(image_.Build(), Contents());
}

// Promise: "EAS_WRITE_MUST_EXIST"
// Promise: "MAVOEASWrite: Writes `size`"
// Promise: "MAVOEASWrite: errno alone"
TEST_F(EasEntriesTest, AMissingNameIsNotCreatedWhenItMustExist) {
    OpenThree();
    for (const int flags : {EAS_WRITE_MUST_EXIST + 0, EAS_WRITE_MUST_EXIST | EAS_WRITE_OVERWRITE}) {
        errno = 0;
        EXPECT_EQ(-1, Write(handle_, "z", "x", 0, flags));
        EXPECT_EQ(ENOENT, errno);
        EXPECT_EQ(-1, Write(handle_, "z", "", 0, flags));
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_THAT(TakeFileCalls(), IsEmpty());
    EXPECT_EQ(image_.Build(), Contents());
    // One that does exist is written.
    EXPECT_EQ(1, Write(handle_, "c", "X", 0, EAS_WRITE_MUST_EXIST | EAS_WRITE_OVERWRITE));
    EXPECT_EQ(Ascii("X"), Read(handle_, "c"));
}

TEST_F(EasEntriesTest, AnAttributeThatIsCreatedLeavesNoRecord) {
    handle_ = Open();
    EXPECT_EQ(1, Write(handle_, "a", "1", 0, 0));
    EXPECT_EQ(1, Write(handle_, "b", "1", 0, EAS_WRITE_OVERWRITE));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(0, MLIBCErrGet());
}

// Promise: "MAVOEASWrite: -1 with a code: 0xD00"
TEST_F(EasEntriesTest, WriteRefusesMissingArguments) {
    OpenThree();
    EXPECT_EQ(-1, MAVOEASWrite(nullptr, "a", "x", 1, 0, 1));
    EXPECT_EQ(-1, MAVOEASWrite(h(), nullptr, "x", 1, 0, 1));
    EXPECT_EQ(-1, MAVOEASWrite(h(), "a", nullptr, 1, 0, 1));
    EXPECT_EQ(-1, MAVOEASWrite(h(), "a", "x", 0x80000000u, 0, 1));
    h()->fd = -1;
    EXPECT_EQ(-1, MAVOEASWrite(h(), "a", "x", 1, 0, 1));
    h()->fd = fd_;
    const std::vector<Record> records = TakeRecords();
    EXPECT_EQ(5u, records.size());
    EXPECT_THAT(records, Each(RecordOf(0xD00, "eas_write")));
    EXPECT_EQ(0, MAVOEASWrite(h(), "a", nullptr, 0, 0, 1));  // no data is no missing data
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasEntriesTest, TheLongestSizeThatAResultCanTellIsNoWrongArgument) {
    OpenThree();
    errno = 0;
    EXPECT_EQ(-1, MAVOEASWrite(h(), "absent", "x", 0x7FFFFFFF, 0, EAS_WRITE_MUST_EXIST));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// What errno was before is no reason to read on behind the end of the file.
// Promise: "MAVOEASWrite: 0xA00"
TEST_F(EasEntriesTest, ValuesThatTheFileEndsBeforeCannotBeMoved) {
    OpenThree();
    const Bytes before = Contents();
    const ShortCall file_ends("preadv", 1, 0, true);
    errno = EINTR;
    EXPECT_EQ(-1, Write(handle_, "a", "longer"));
    EXPECT_TRUE(file_ends.fired());
    EXPECT_EQ(EIO, errno);
    EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
    EXPECT_EQ(before, Contents());
}

// Promise: "MAVOEASWrite: 0x300"
// Promise: "MAVOEASRemove: 0x300"
// Promise: "MAVOEASTruncate: 0x300"
// Promise: "MAVOEASWriteHeader: 0x300"
TEST_F(EasEntriesTest, ChangesNeedTheWriteLock) {
    OpenThree();
    for (const int lock_type : {F_RDLCK, F_UNLCK}) {
        SCOPED_TRACE(lock_type);
        h()->lockType = lock_type;
        EXPECT_EQ(-1, Write(handle_, "a", "x"));
        EXPECT_EQ(-1, MAVOEASRemove(h(), "a"));
        EXPECT_EQ(-1, MAVOEASTruncate(h(), "a", 1));
        h()->header[kFinderInfoAt] ^= 1;
        EXPECT_EQ(-1, MAVOEASWriteHeader(h()));
        EXPECT_THAT(
            TakeRecords(),
            ElementsAre(RecordOf(0x300, "eas_write"), RecordOf(0x300, "eas_remove"),
                        RecordOf(0x300, "eas_truncate"), RecordOf(0x300, "eas_write_header")));
    }
    h()->lockType = F_WRLCK;
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEntriesTest, TheTableGrowsByFive) {
    handle_ = Open();
    ASSERT_EQ(5, h()->capacity);
    for (int i = 0; i < 11; ++i) {
        SCOPED_TRACE(i);
        ASSERT_EQ(1, Write(handle_, "n" + std::to_string(i), "v"));
        EXPECT_EQ(i < 5 ? 5 : i < 10 ? 10 : 15, h()->capacity);
    }
    for (int i = 11; i < 15; ++i) EXPECT_EQ(nullptr, h()->entries[i].name);
    // Opened again, the table has no room to spare.
    handle_ = Open();
    EXPECT_EQ(11, h()->capacity);
    ASSERT_EQ(1, Write(handle_, "one more", "v"));
    EXPECT_EQ(16, h()->capacity);
}

TEST_F(EasEntriesTest, AnOverwriteIsOneReadOneWriteAndOneSync) {
    image_ = {};
    for (int i = 0; i < 10; ++i) image_.attributes.push_back({"n" + std::to_string(i), Ascii("v")});
    image_.fork = Pattern(40000);
    Reopen();
    ASSERT_EQ(1, Write(handle_, "n4", "w"));
    const std::vector<std::string> calls = TakeCalls();
    ASSERT_EQ(4u, calls.size());
    EXPECT_EQ("lseek(0, " + std::to_string(SEEK_END) + ")", calls[0]);
    EXPECT_THAT(calls[1], StartsWith("preadv("));
    EXPECT_THAT(calls[2], WriteOfAll(image_.TotalSize()));
    EXPECT_EQ("fsync()", calls[3]);
}

// Promise: "MAVOEASWrite: Writes `size`"
// Promise: "MAVOEASRemove: Removes"
// Promise: "MAVOEASTruncate: Sets"
TEST_F(EasEntriesTest, EveryChangeIsSyncedOnce) {
    OpenThree();
    ASSERT_EQ(1, Write(handle_, "new", "x"));
    EXPECT_THAT(TakeCallNames(), Contains("fsync").Times(1));
    ASSERT_EQ(1, Write(handle_, "new", "y"));
    EXPECT_THAT(TakeCallNames(), Contains("fsync").Times(1));
    ASSERT_EQ(0, MAVOEASTruncate(h(), "new", 1));
    EXPECT_THAT(TakeCallNames(), Contains("fsync").Times(1));
    ASSERT_EQ(0, MAVOEASRemove(h(), "new"));
    const std::vector<std::string> calls = TakeCallNames();
    EXPECT_THAT(calls, Contains("fsync").Times(1));
    EXPECT_EQ("fsync", calls.back());
}

// ---- Large streams ------------------------------------------------------------------------------

// Of more than 64 KiB: what does not change is neither read nor written.
class EasLargeTest : public EasEntriesTest {
 protected:
    static constexpr unsigned kSize = 30'000;

    void OpenLarge(std::size_t fork = 0) {
        image_ = {.attributes = {{"a", Pattern(kSize, 1)},
                                 {"b", Pattern(kSize, 2)},
                                 {"c", Pattern(kSize, 3)}},
                  .fork = Pattern(fork, 4)};
        Reopen();
    }
    std::string Range(std::uint64_t size, std::uint64_t at) {
        return "(" + std::to_string(size) + ", " + std::to_string(at) + ")";
    }
    // Where the values begin, and the one of that index.
    std::uint64_t Start(unsigned index = 0) { return image_.DataStart() + index * kSize; }
};

TEST_F(EasLargeTest, OfTheLastOnlyTheNewBytesAreWritten) {
    for (const std::size_t fork : {0u, 40'000u}) {
        OpenLarge(fork);
        const Bytes value = Pattern(kSize, 9);
        ASSERT_EQ(static_cast<int>(kSize), Write(handle_, "c", value));
        EXPECT_THAT(TakeFileCalls(), ElementsAre("pwrite" + Range(kSize, Start(2)),
                                                 "pread" + Range(Start(), 0), "fsync()"));
        image_.attributes[2].value = value;
        EXPECT_EQ(image_.Build(), Contents());
        ASSERT_EQ(4, Write(handle_, "c", "four", 100));
        EXPECT_THAT(TakeFileCalls(), ElementsAre("pwrite" + Range(4, Start(2) + 100),
                                                 "pread" + Range(Start(), 0), "fsync()"));
        const Bytes four = Ascii("four");
        std::copy(four.begin(), four.end(), image_.attributes[2].value.begin() + 100);
        EXPECT_EQ(image_.Build(), Contents());
        ASSERT_EQ(0, Write(handle_, "c", "", 100));
        EXPECT_EQ(image_.Build(), Contents());
    }
}

TEST_F(EasLargeTest, OfAnotherWhatLiesBeforeItIsNotTouched) {
    OpenLarge(40'000);
    const Bytes value = Pattern(100, 9);
    ASSERT_EQ(100, Write(handle_, "b", value, 7));
    EXPECT_THAT(TakeFileCalls(),
                ElementsAre("preadv" + Range(2 * kSize, Start(1)), "pread" + Range(Start(), 0),
                            "pwrite" + Range(Start(), 0), "pwrite" + Range(2 * kSize, Start(1)),
                            "fsync()"));
    std::copy(value.begin(), value.end(), image_.attributes[1].value.begin() + 7);
    std::swap(image_.attributes[1], image_.attributes[2]);
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasLargeTest, RandomOverwritesComeToWhatTheyShould) {
    std::mt19937 random(7);
    const auto below = [&](unsigned count) { return static_cast<unsigned>(random()) % count; };
    for (const std::size_t fork : {0u, 20'000u}) {
        OpenLarge(fork);
        for (int i = 0; i < 200; ++i) {
            SCOPED_TRACE(i);
            const std::size_t index = below(2) == 0 ? 2 : below(3);
            Attribute attribute = image_.attributes[index];
            const Bytes bytes =
                Pattern(below(4) == 0 ? below(9'000) : below(40), static_cast<std::uint8_t>(i));
            const auto length = static_cast<unsigned>(attribute.value.size());
            const unsigned offset = below(3) == 0 ? length + below(20) : below(length);
            ASSERT_EQ(static_cast<int>(bytes.size()),
                      Write(handle_, attribute.name, bytes, offset));
            if (length < offset + bytes.size()) attribute.value.resize(offset + bytes.size());
            std::copy(bytes.begin(), bytes.end(),
                      attribute.value.begin() + static_cast<std::ptrdiff_t>(offset));
            image_.attributes.erase(image_.attributes.begin() + static_cast<std::ptrdiff_t>(index));
            image_.attributes.push_back(attribute);
            ASSERT_TRUE(image_.Build() == Contents());
        }
        const HandleState state = StateOf(*h());
        handle_ = Open();
        EXPECT_TRUE(state == StateOf(*h()));
    }
}

// Somebody else has written, without a lock: header and table are as this handle has them, values
// as they are in the file.
TEST_F(EasLargeTest, WhatHasChangedInTheFileIsFound) {
    for (const std::uint64_t at : {std::uint64_t{60}, std::uint64_t{kTableAt} + 5}) {
        OpenLarge();
        ASSERT_EQ(1, ::pwrite(fd_, "?", 1, static_cast<off_t>(at)));
        ASSERT_EQ(1, ::pwrite(fd_, "?", 1, static_cast<off_t>(Start(1))));
        ASSERT_EQ(1, Write(handle_, "c", "!"));
        image_.attributes[1].value[0] = '?';
        image_.attributes[2].value[0] = '!';
        EXPECT_EQ(image_.Build(), Contents());
    }
    ASSERT_EQ(0, ftruncate(fd_, static_cast<off_t>(Start(3) - 1)));
    const Bytes before = Contents();
    EXPECT_EQ(-1, Write(handle_, "c", "?"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_write")));
    EXPECT_EQ(before, Contents());
}

TEST_F(EasLargeTest, AHeadThatCannotBeComparedIsWritten) {
    for (const char* const call : {"pread(", "malloc(168)"}) {
        SCOPED_TRACE(call);
        OpenLarge();
        Hooks().fails = [call](const std::string& made) {
            return made.starts_with(call) ? ENOMEM : 0;
        };
        EXPECT_EQ(1, Write(handle_, "c", "!"));
        Hooks().fails = nullptr;
        EXPECT_THAT(TakeWrites(), ElementsAre("pwrite" + Range(1, Start(2)),
                                              "pwrite" + Range(Start(), 0), "fsync()"));
        image_.attributes[2].value[0] = '!';
        EXPECT_EQ(image_.Build(), Contents());
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasLargeTest, AShortWriteIsRecordedByTheUnitWhosePartItCuts) {
    struct Case {
        int nth;
        unsigned bytes;
        const char* unit;
    };
    for (const Case& c : {Case{1, 0, "eas_write_header"}, Case{1, 167, "eas_write_header"},
                          Case{2, 0, "eas_write"}, Case{2, 2 * kSize - 1, "eas_write"}}) {
        OpenLarge();
        const ShortCall fault("pwrite", c.nth, c.bytes);
        EXPECT_EQ(-1, Write(handle_, "b", "!"));
        EXPECT_TRUE(fault.fired());
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xB00, c.unit)));
        EXPECT_THAT(TakeCallNames(), ::testing::Not(Contains("fsync")));
    }
}

// ---- Room ---------------------------------------------------------------------------------------

class EasRoomTest : public EasEntriesTest {
 protected:
    // The ways to make a stream longer by many blocks.
    std::vector<std::function<int()>> Growths() {
        return {
            [this] { return Write(handle_, "new", Pattern(100'000)); },
            [this] { return Write(handle_, "a", Pattern(100'000)); },
            [this] { return MAVOEASTruncate(h(), "a", 100'000); },
        };
    }

    blkcnt_t Blocks() const {
        struct stat info;
        return fstat(fd_, &info) == 0 ? info.st_blocks : -1;
    }
};

TEST_F(EasRoomTest, NoneIsTakenBeforeTheValuesHaveBeenRead) {
    for (const auto& grow : Growths()) {
        OpenThree();
        Hooks().fails = [](const std::string& call) { return call.starts_with("pread") ? EIO : 0; };
        EXPECT_EQ(-1, grow());
        Hooks().fails = nullptr;
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
        EXPECT_THAT(TakeCallNames(), ::testing::Not(Contains("fallocate")));
    }
}

TEST_F(EasRoomTest, ItIsGivenBackWhenNothingIsWritten) {
    for (const char* const failing : {"pwrite", "ftruncate(1"}) {
        for (const auto& grow : Growths()) {
            SCOPED_TRACE(failing);
            OpenThree();
            if (*failing == 'p') image_.fork.clear();
            Reopen();
            ASSERT_EQ(0, ::fsync(fd_));
            const blkcnt_t before = Blocks();
            Hooks().fails = [failing](const std::string& call) {
                return call.starts_with(failing) ? EIO : 0;
            };
            const int result = grow();
            const int error = errno;
            Hooks().fails = nullptr;
            TakeRecords();
            if (result == 0) continue;  // A truncation moves no fork.
            EXPECT_EQ(-1, result);
            EXPECT_EQ(EIO, error);
            EXPECT_THAT(TakeCallNames(), Contains("fallocate"));
            EXPECT_EQ(image_.Build(), Contents());
            EXPECT_EQ(before, Blocks());
        }
    }
}

TEST_F(EasRoomTest, AnEmptyFileGivesAllOfItBack) {
    handle_ = Open();
    const blkcnt_t before = Blocks();
    {
        const FailCall fault("pwrite", EIO);
        EXPECT_EQ(-1, Write(handle_, "new", Pattern(100'000)));
    }
    TakeRecords();
    EXPECT_THAT(TakeCallNames(), Contains("fallocate"));
    EXPECT_EQ(Bytes(), Contents());
    EXPECT_EQ(before, Blocks());
}

TEST_F(EasRoomTest, WhatAVolumeHadOfItIsGivenBackToo) {
    for (const auto& grow : Growths()) {
        OpenThree();
        const HandleState state = StateOf(*h());
        {
            const FailCall fault("fallocate", ENOSPC);
            EXPECT_EQ(-1, grow());
            EXPECT_EQ(ENOSPC, errno);
        }
        EXPECT_THAT(TakeCodes(), ElementsAre(0xB00));
        const std::vector<std::string> calls = TakeCalls();
        ASSERT_FALSE(calls.empty());
        EXPECT_EQ("ftruncate(" + std::to_string(image_.End()) + ")", calls.back());
        EXPECT_EQ(image_.Build(), Contents());
        EXPECT_TRUE(state == StateOf(*h()));
        EXPECT_EQ(6, Write(handle_, "a", "longer"));  // The handle is as good as it was.
        EXPECT_EQ(Ascii("longer"), Read(handle_, "a"));
    }
}

TEST_F(EasRoomTest, AStreamThatHasBeenWrittenKeepsIt) {
    for (const auto& grow : Growths()) {
        OpenThree();
        image_.fork.clear();
        Reopen();
        EXPECT_LE(0, grow());
        EXPECT_THAT(TakeCallNames(), ::testing::Not(Contains("ftruncate")));
    }
}

// -------------------------------------------------------------------------------------------------

TEST_F(EasEntriesTest, TheTableIsContiguousHoweverLong) {
    handle_ = Open();
    for (int i = 0; i < 60; ++i) {
        const std::string name(static_cast<std::size_t>(i * 37 % 255), static_cast<char>('A' + i));
        const Bytes value = Pattern(static_cast<std::size_t>(i * 13 % 50), 7);
        if (name.empty()) continue;
        image_.attributes.push_back({name, value});
        ASSERT_EQ(static_cast<int>(value.size()), Write(handle_, name, value));
    }
    ASSERT_GT(image_.TableSize(), 5000u);
    EXPECT_EQ(image_.Build(), Contents());
}

// ---- Remove -------------------------------------------------------------------------------------

TEST_F(EasEntriesTest, RemovingTheOnlyAttributeCutsTheFileTo120BytesAndTheFork) {
    for (const std::size_t fork : {0u, 1u, 100u, 20000u}) {
        SCOPED_TRACE(fork);
        image_ = {.attributes = {{"a", Pattern(300)}}, .fork = Pattern(fork)};
        Reopen();
        ASSERT_EQ(0, MAVOEASRemove(h(), "a"));
        EXPECT_EQ(120u + fork, FileSize());
        image_.attributes.clear();
        EXPECT_EQ(image_.Build(), Contents());
        EXPECT_EQ(120u, U32At(h()->header, kDataStartAt));
        EXPECT_EQ(0u, U32At(h()->header, kDataLengthAt));
        EXPECT_EQ(nullptr, h()->entries[0].name);
    }
}

// Promise: "MAVOEASRemove: Removes"
TEST_F(EasEntriesTest, EachAttributeCanBeRemoved) {
    for (const std::size_t index : {0u, 1u, 2u}) {
        SCOPED_TRACE(index);
        OpenThree();
        ASSERT_EQ(0, MAVOEASRemove(h(), image_.attributes[index].name.c_str()));
        image_.attributes.erase(image_.attributes.begin() + static_cast<std::ptrdiff_t>(index));
        EXPECT_EQ(image_.Build(), Contents());
        const HandleState state = StateOf(*h());
        handle_ = Open();
        EXPECT_TRUE(state == StateOf(*h()));  // memory and file agree
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "MAVOEASRemove: Removes"
TEST_F(EasEntriesTest, RemoveCutsWhatLaysBehindTheFork) {
    OpenThree();
    ASSERT_EQ(0, ftruncate(fd_, 10000));
    ASSERT_EQ(0, MAVOEASRemove(h(), "b"));
    image_.attributes.erase(image_.attributes.begin() + 1);
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEntriesTest, AFileThatCannotBeCutIsARemovalAllTheSame) {
    OpenThree();
    const FailCall fault("ftruncate", EIO, 0);
    EXPECT_EQ(0, MAVOEASRemove(h(), "b"));
    EXPECT_TRUE(fault.fired());
    image_.attributes.erase(image_.attributes.begin() + 1);
    EXPECT_EQ(image_.Build(), Contents(image_.End()));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "MAVOEASRemove: -1: 0xD00"
// Promise: "MAVOEASRemove: 0x2000"
TEST_F(EasEntriesTest, RemoveRefusesWhatIsNotThere) {
    OpenThree();
    EXPECT_EQ(-1, MAVOEASRemove(nullptr, "a"));
    EXPECT_EQ(-1, MAVOEASRemove(h(), nullptr));
    h()->fd = -1;
    EXPECT_EQ(-1, MAVOEASRemove(h(), "a"));
    h()->fd = fd_;
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0xD00, "eas_remove"), RecordOf(0xD00, "eas_remove"),
                            RecordOf(0xD00, "eas_remove")));
    EXPECT_EQ(-1, MAVOEASRemove(h(), "z"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2000, "eas_search")));
    EXPECT_EQ(image_.Build(), Contents());
}

// The size of a dropped record is counted in eight bits: with names of 242 bytes or more, their NUL
// included, 256 bytes too few are taken out.
// Promise: "How long names can be: of an attribute that is removed"
// Promise: "EA stream: **A gap between"
TEST_F(EasEntriesTest, RemovingALongNameLeavesAGapOf256Bytes) {
    for (const std::size_t letters : {240u, 241u, 250u, 254u}) {
        SCOPED_TRACE(letters);
        const std::uint32_t gap = letters >= 241 ? 256 : 0;
        const std::string name(letters, 'n');
        image_ = {.attributes = {{"a", Ascii("one")}, {name, Ascii("long")}, {"c", Ascii("three")}},
                  .fork = Pattern(500)};
        Reopen();
        ASSERT_EQ(0, MAVOEASRemove(h(), name.c_str()));
        image_.attributes.erase(image_.attributes.begin() + 1);
        image_.gap = gap;
        EXPECT_EQ(120u + 32u + gap, U32At(h()->header, kDataStartAt));

        const auto matches = [&] {
            Bytes expected = image_.Build();
            const Bytes found = Contents();
            if (found.size() < expected.size()) return false;
            const std::size_t gap_at = kTableAt + image_.TableSize();
            std::copy_n(found.begin() + static_cast<std::ptrdiff_t>(gap_at), image_.gap,
                        expected.begin() + static_cast<std::ptrdiff_t>(gap_at));
            return expected == found;
        };
        EXPECT_TRUE(matches());

        // The stream goes on being read and written.
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        EXPECT_EQ(Ascii("one"), Read(handle_, "a"));
        EXPECT_EQ(Ascii("three"), Read(handle_, "c"));
        ASSERT_EQ(3, Write(handle_, "d", "new"));
        image_.attributes.push_back({"d", Ascii("new")});
        EXPECT_TRUE(matches());
        ASSERT_EQ(3, Write(handle_, "a", "ONE"));
        std::rotate(image_.attributes.begin(), image_.attributes.begin() + 1,
                    image_.attributes.end());
        image_.attributes.back().value = Ascii("ONE");
        EXPECT_TRUE(matches());
        ASSERT_EQ(0, MAVOEASRemove(h(), "c"));
        image_.attributes.erase(image_.attributes.begin());
        EXPECT_TRUE(matches());
        EXPECT_THAT(TakeRecords(), IsEmpty());
        // With the last attribute gone, the next write begins at 120 again.
        ASSERT_EQ(0, MAVOEASRemove(h(), "a"));
        ASSERT_EQ(0, MAVOEASRemove(h(), "d"));
        image_.attributes.clear();
        EXPECT_TRUE(matches());
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        ASSERT_EQ(5, Write(handle_, "fresh", "start"));
        image_.attributes = {{"fresh", Ascii("start")}};
        image_.gap = 0;
        EXPECT_EQ(image_.Build(), Contents(image_.End()));
        EXPECT_THAT(TakeRecords(), IsEmpty());
    }
}

TEST_F(EasEntriesTest, RemovingOnlyALongNameLeavesDataStartAt376) {
    image_ = {.attributes = {{std::string(254, 'n'), Ascii("long")}}, .fork = Pattern(50)};
    Reopen();
    ASSERT_EQ(0, MAVOEASRemove(h(), image_.attributes[0].name.c_str()));
    EXPECT_EQ(376u, U32At(h()->header, kDataStartAt));
    EXPECT_EQ(376u, U32At(h()->header, kTotalSizeAt));
    EXPECT_EQ(376u, U32At(h()->header, kForkOffsetAt));
    EXPECT_EQ(426u, FileSize());
    EXPECT_EQ(Pattern(50), Contents(50, 376));
}

// ---- Truncate -----------------------------------------------------------------------------------

// Promise: "MAVOEASTruncate: Sets"
// Promise: "MAVOEASTruncate: The attribute becomes"
TEST_F(EasEntriesTest, TruncateShortensAValueButNotTheFile) {
    OpenThree();
    image_.fork.clear();
    Reopen();
    const std::uint64_t size = FileSize();
    ASSERT_EQ(0, MAVOEASTruncate(h(), "b", 3));
    image_.attributes = {{"a", Ascii("one")}, {"c", Ascii("3")}, {"b", Ascii("sec")}};
    EXPECT_EQ(image_.Build(), Contents(image_.End()));
    EXPECT_EQ(size, FileSize());
    ASSERT_EQ(0, MAVOEASTruncate(h(), "b", 0));
    image_.attributes[2].value.clear();
    EXPECT_EQ(image_.Build(), Contents(image_.End()));
    EXPECT_EQ(size, FileSize());
    EXPECT_EQ(Bytes{}, Read(handle_, "b"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "MAVOEASTruncate: Sets"
TEST_F(EasEntriesTest, TruncateLengthensAValueWithZeros) {
    OpenThree();
    image_.fork.clear();
    Reopen();
    ASSERT_EQ(0, MAVOEASTruncate(h(), "a", 3000));
    Bytes value = Ascii("one");
    value.resize(3000);
    image_.attributes = {{"b", Ascii("seconds")}, {"c", Ascii("3")}, {"a", value}};
    EXPECT_EQ(image_.Build(), Contents());
    // The same length again changes nothing but the order.
    ASSERT_EQ(0, MAVOEASTruncate(h(), "b", 7));
    std::rotate(image_.attributes.begin(), image_.attributes.begin() + 1, image_.attributes.end());
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEntriesTest, TruncateLeavesNoOldBytesInAValueThatGrowsAgain) {
    image_ = {.attributes = {{"a", Pattern(100)}}};
    Reopen();
    ASSERT_EQ(0, MAVOEASTruncate(h(), "a", 10));
    ASSERT_EQ(0, MAVOEASTruncate(h(), "a", 50));
    Bytes value = Pattern(100);
    value.resize(10);
    value.resize(50);
    EXPECT_EQ(value, Read(handle_, "a"));
}

// Promise: "MAVOEASTruncate: The resource fork's"
TEST_F(EasEntriesTest, TruncateMovesTheForksOffsetButNotItsBytes) {
    for (const unsigned length : {0u, 7u, 50u}) {
        SCOPED_TRACE(length);
        OpenThree();
        const Bytes before = Contents();
        ASSERT_EQ(0, MAVOEASTruncate(h(), "b", length));
        Bytes value = Ascii("seconds");
        value.resize(length);
        StreamImage after = image_;
        after.attributes = {{"a", Ascii("one")}, {"c", Ascii("3")}, {"b", value}};
        const std::uint32_t total = after.TotalSize();
        Bytes expected = after.Build();
        expected.resize(total);
        expected.insert(expected.end(), before.begin() + static_cast<std::ptrdiff_t>(total),
                        before.end());
        EXPECT_EQ(expected, Contents());
        EXPECT_EQ(before.size(), FileSize());
        EXPECT_EQ(total, U32At(h()->header, kForkOffsetAt));
        EXPECT_EQ(100u, U32At(h()->header, kForkLengthAt));
        EXPECT_THAT(TakeCallNames(), ::testing::Not(Contains("ftruncate")));
    }
}

// Promise: "MAVOEASTruncate: 0x2A00"
TEST_F(EasEntriesTest, TruncateRecordsAFailedFlushTwice) {
    OpenThree();
    const FailCall fault("fsync", EIO);
    EXPECT_EQ(-1, MAVOEASTruncate(h(), "b", 3));
    EXPECT_EQ(EIO, errno);
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0x2A00, "eas_flush"), RecordOf(0x2A00, "eas_truncate")));
}

// Promise: "MAVOEASWrite: 0x2A00"
// Promise: "MAVOEASRemove: 0x2A00"
TEST_F(EasEntriesTest, OtherChangesRecordAFailedFlushOnce) {
    OpenThree();
    const FailCall fault("fsync", EIO, 0);
    EXPECT_EQ(-1, Write(handle_, "b", "B"));
    EXPECT_EQ(EIO, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "eas_flush")));
    EXPECT_EQ(-1, MAVOEASRemove(h(), "b"));
    EXPECT_EQ(EIO, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "eas_flush")));
}

// Promise: "MAVOEASTruncate: -1: 0xD00"
// Promise: "MAVOEASTruncate: 0x2000"
TEST_F(EasEntriesTest, TruncateRefusesWhatIsNotThere) {
    OpenThree();
    EXPECT_EQ(-1, MAVOEASTruncate(nullptr, "a", 1));
    EXPECT_EQ(-1, MAVOEASTruncate(h(), nullptr, 1));
    h()->fd = -1;
    EXPECT_EQ(-1, MAVOEASTruncate(h(), "a", 1));
    h()->fd = fd_;
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0xD00, "eas_truncate"), RecordOf(0xD00, "eas_truncate"),
                            RecordOf(0xD00, "eas_truncate")));
    EXPECT_EQ(-1, MAVOEASTruncate(h(), "z", 1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2000, "eas_search")));
    EXPECT_EQ(image_.Build(), Contents());
}

// ---- The table ----------------------------------------------------------------------------------

// Promise: "name: NULL in unused records"
// Promise: "capacity"
// Promise: "MAVOEASAllocEntry: Enlarges"
// Promise: "MAVOEASAllocEntry: -1: 0xD00"
// Promise: "MAVOEASAllocEntry: 0x200"
TEST_F(EasEntriesTest, AllocEntryAddsFiveRecordsOrAsManyAsAreAskedFor) {
    OpenThree();
    const HandleState before = StateOf(*h());
    EXPECT_EQ(0, MAVOEASAllocEntry(h(), 0));
    EXPECT_EQ(8, h()->capacity);
    EXPECT_EQ(0, MAVOEASAllocEntry(h(), 7));
    EXPECT_EQ(15, h()->capacity);
    for (int i = 3; i < 15; ++i) {
        const EASEntry& entry = h()->entries[i];
        EXPECT_EQ(nullptr, entry.name);
        EXPECT_EQ(0u, entry.offset + entry.length + entry.flags + entry.nameLength);
    }
    EXPECT_TRUE(before == StateOf(*h()));

    const FailCall fault("malloc", ENOMEM);
    EXPECT_EQ(-1, MAVOEASAllocEntry(h(), 3));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x200, "eas_alloc_entry")));
    EXPECT_EQ(15, h()->capacity);
    EXPECT_TRUE(before == StateOf(*h()));
    EXPECT_EQ(-1, MAVOEASAllocEntry(nullptr, 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_alloc_entry")));
}

// Promise: "MAVOEASWriteHeader: Writes header"
// Promise: "MAVOEASWriteHeader: Total size"
TEST_F(EasEntriesTest, WriteHeaderWritesHeaderAndTableAndStandsAtDataStart) {
    OpenThree();
    image_.finder_info = Pattern(32, 77);
    std::copy(image_.finder_info.begin(), image_.finder_info.end(), h()->header + kFinderInfoAt);
    PutU32(h()->header, kTotalSizeAt, 1);
    PutU32(h()->header, kFinderLengthAt, 2);
    PutU32(h()->header, kForkOffsetAt, 3);
    ASSERT_EQ(0, ::lseek(fd_, 0, SEEK_SET));
    EXPECT_EQ(0, MAVOEASWriteHeader(h()));
    EXPECT_EQ(168, ::lseek(fd_, 0, SEEK_CUR));
    EXPECT_EQ(image_.Build(), Contents());
    EXPECT_EQ(Contents(120), StateOf(*h()).header);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasEntriesTest, WriteHeaderOfANewStreamWrites120Bytes) {
    handle_ = Open();
    EXPECT_EQ(0, MAVOEASWriteHeader(h()));
    EXPECT_EQ(StreamImage{}.Build(), Contents());
    EXPECT_EQ(120, ::lseek(fd_, 0, SEEK_CUR));
}

// Nobody could open, or rewrite, what it would leave.
// Promise: "MAVOEASWriteHeader: 0xA00"
TEST_F(EasEntriesTest, WriteHeaderRefusesATableThatDoesNotFitTheDataArea) {
    const auto refused = [&](const char* what) {
        SCOPED_TRACE(what);
        const HandleState before = StateOf(*h());
        TakeCalls();
        EXPECT_EQ(-1, MAVOEASWriteHeader(h()));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_write_header")));
        EXPECT_THAT(TakeCalls(), IsEmpty());
        EXPECT_TRUE(before == StateOf(*h()));
        EXPECT_EQ(image_.Build(), Contents());
    };
    OpenThree();
    for (const std::uint32_t start : {0u, 120u, 167u, 169u, 0xFFFFFFFFu}) {
        PutU32(h()->header, kDataStartAt, start);
        refused("data start");
    }
    OpenThree();
    for (const std::uint32_t length : {0u, 10u, 12u, 0xFFFFFFFFu}) {
        PutU32(h()->header, kDataLengthAt, length);
        refused("data length");
    }
    OpenThree();
    ++h()->entries[1].offset;
    refused("a value's offset");
    OpenThree();
    ++h()->entries[1].length;
    refused("a value's length");
    OpenThree();
    ++h()->entries[2].length;
    refused("the last value's length");
    OpenThree();
    PutU16(h()->header, kAttributeCountAt, 2);
    refused("one record less");
    OpenThree();
    PutU16(h()->header, kAttributeCountAt, 4);
    // More than there are; StateOf() would look at them.
    EXPECT_EQ(-1, MAVOEASWriteHeader(h()));
    ASSERT_EQ(0, MAVOEASAllocEntry(h(), 1));
    EXPECT_EQ(-1, MAVOEASWriteHeader(h()));  // one without a name
    PutU16(h()->header, kAttributeCountAt, 3);
    EXPECT_THAT(TakeCodes(), ElementsAre(0xA00, 0xA00));
    EXPECT_EQ(image_.Build(), Contents());
    OpenThree();
    h()->entries[0].nameLength += 4;
    refused("a longer name");
}

TEST_F(EasEntriesTest, WriteHeaderNeedsNoValuesInTheFile) {
    handle_ = Open();
    ASSERT_EQ(3, Write(handle_, "a", "one"));
    ASSERT_EQ(0, ftruncate(fd_, 0));
    EXPECT_EQ(0, MAVOEASWriteHeader(h()));
    image_.attributes = {{"a", Ascii("one")}};
    EXPECT_EQ(136u, FileSize());
    EXPECT_EQ(3, ::write(fd_, "one", 3));
    EXPECT_EQ(image_.Build(), Contents());
    // Where there are no values the data area may begin anywhere behind the table.
    ASSERT_EQ(0, MAVOEASRemove(h(), "a"));
    PutU32(h()->header, kDataStartAt, 376);
    EXPECT_EQ(0, MAVOEASWriteHeader(h()));
    EXPECT_EQ(376, ::lseek(fd_, 0, SEEK_CUR));
    EXPECT_EQ(376u, U32At(Contents(), kForkOffsetAt));
    PutU32(h()->header, kDataStartAt, 119);
    EXPECT_EQ(-1, MAVOEASWriteHeader(h()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_write_header")));
}

// Promise: "mavoea.h: elsewhere a failure leaves the `errno`"
// Promise: "MAVOEASWriteHeader: -1: 0xD00"
// Promise: "MAVOEASWriteHeader: 0x200"
// Promise: "MAVOEASWriteHeader: 0xA00"
// Promise: "MAVOEASWriteHeader: 0xB00"
TEST_F(EasEntriesTest, WriteHeaderReportsWhatFails) {
    EXPECT_EQ(-1, MAVOEASWriteHeader(nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write_header")));
    OpenThree();
    h()->fd = -1;
    EXPECT_EQ(-1, MAVOEASWriteHeader(h()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write_header")));
    h()->fd = fd_;
    const int live = TakeAllocations().live;
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        const FailNthCall fault(nth, EIO);
        const int result = MAVOEASWriteHeader(h());
        const int error = errno;
        EXPECT_EQ(live, TakeAllocations().live);
        if (!fault.fired()) {
            EXPECT_EQ(0, result);
            break;
        }
        EXPECT_EQ(-1, result);
        EXPECT_EQ(EIO, error);
        const int code = fault.name() == "malloc"                             ? 0x200
                         : fault.name() == "lseek" || fault.name() == "fstat" ? 0xA00
                                                                              : 0xB00;
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, "eas_write_header"))) << fault.name();
    }
    EXPECT_EQ(image_.Build(), Contents());
}

// Promise: "MAVOEASWrite: 0xB00"
// Promise: "MAVOEASRemove: 0xB00"
// Promise: "MAVOEASTruncate: 0xB00"
TEST_F(EasEntriesTest, AShortWriteIsRecordedByTheUnitWhosePartItCuts) {
    struct Change {
        const char* unit;
        std::uint32_t data_start;  // header and table end here, the values begin
        std::function<int()> run;
    };
    const std::vector<Change> changes = {
        {"eas_write", 168, [&] { return Write(handle_, "c", "X"); }},
        {"eas_write", 184, [&] { return Write(handle_, "d", "new"); }},
        {"eas_remove", 152, [&] { return MAVOEASRemove(h(), "c"); }},
        {"eas_truncate", 168, [&] { return MAVOEASTruncate(h(), "c", 0); }},
    };
    for (const Change& change : changes) {
        for (const std::uint32_t bytes :
             {0u, 1u, 119u, 120u, 150u, change.data_start - 1, change.data_start + 1}) {
            SCOPED_TRACE(std::string(change.unit) + " " + std::to_string(bytes));
            OpenThree();
            image_.fork.clear();
            Reopen();
            {
                const ShortCall fault("pwrite", 1, bytes);
                EXPECT_EQ(-1, change.run());
                EXPECT_TRUE(fault.fired());
            }
            EXPECT_THAT(TakeRecords(),
                        ElementsAre(RecordOf(
                            0xB00, bytes < change.data_start ? "eas_write_header" : change.unit)));
            // What comes after is not done.
            const std::vector<std::string> calls = TakeCallNames();
            EXPECT_THAT(calls, ::testing::Not(Contains("fsync")));
            EXPECT_THAT(calls, ::testing::Not(Contains("ftruncate")));
        }
    }
}

TEST_F(EasEntriesTest, AWriteThatComesBackShortOnceIsGoneOnWith) {
    OpenThree();
    image_.fork.clear();
    Reopen();
    const ShortCall fault("pwrite", 1, 100, true);
    EXPECT_EQ(3, Write(handle_, "d", "new"));
    EXPECT_TRUE(fault.fired());
    image_.attributes.push_back({"d", Ascii("new")});
    EXPECT_EQ(image_.Build(), Contents());
}

// ---- Names and copies ---------------------------------------------------------------------------

class EasNamesTest : public EasEntriesTest {
 protected:
    // So many attributes, named "name0" and so on, with values of one byte.
    void OpenMany(int count) {
        image_ = {.fork = Pattern(50)};
        for (int i = 0; i < count; ++i) {
            image_.attributes.push_back({"name" + std::to_string(i), Ascii("v")});
        }
        live_ = TakeAllocations().live;
        Reopen();
    }

    static std::string NameOfMany(int index) { return "user.attribute." + std::to_string(index); }

    // What a caller does who gives an attribute another name.
    static char* Copy(const std::string& name) {
        auto* const copy = static_cast<char*>(kernel::Allocate(name.size() + 1));
        std::copy_n(name.c_str(), name.size() + 1, copy);
        return copy;
    }

    void Change(EASHandle* handle) {
        EXPECT_EQ(0, MAVOEASRemove(handle, "name2"));
        EXPECT_EQ(1, MAVOEASWrite(handle, "name1", "w", 1, 0, EAS_WRITE_OVERWRITE));
        for (const char* const name : {"n1", "n2", "n3", "n4", "n5", "n6", "n7"}) {
            EXPECT_EQ(1, MAVOEASWrite(handle, name, "x", 1, 0, 0)) << name;
            image_.attributes.push_back({name, Ascii("x")});
        }
        EXPECT_EQ(0, MAVOEASRemove(handle, "n3"));
        std::erase_if(image_.attributes, [](const Attribute& attribute) {
            return attribute.name == "name2" || attribute.name == "name1" || attribute.name == "n3";
        });
        const auto at = std::find_if(image_.attributes.begin(), image_.attributes.end(),
                                     [](const Attribute& each) { return each.name == "n1"; });
        image_.attributes.insert(at, {"name1", Ascii("w")});
        EXPECT_EQ(image_.Build(), Contents());
    }

    void ExpectNothingLeft() {
        handle_.reset();
        EXPECT_EQ(live_, TakeAllocations().live);
        EXPECT_THAT(TakeRecords(), IsEmpty());
    }

    int live_ = 0;
};

constexpr int kFewAndMany[] = {3, 32, 33, 200, 600};

// Promise: "EASEntry: A caller may put another name"
// Promise: "EASEntry: it is the handle's then"
// Promise: "EASEntry: In a table of up to 32"
TEST_F(EasNamesTest, OfAFewAttributesCanBeFreedAndReplaced) {
    for (const int count : {3, 32}) {
        SCOPED_TRACE(count);
        OpenMany(count);
        for (int i = 0; i < count; ++i) {
            std::string& name = image_.attributes[static_cast<std::size_t>(i)].name;
            kernel::Free(h()->entries[i].name);
            if (i == 0) name[0] = 'N';
            h()->entries[i].name = Copy(name);
        }
        EXPECT_EQ(0, MAVOEASWriteHeader(h()));
        EXPECT_EQ(image_.Build(), Contents());
        Change(h());
        kernel::Free(h()->entries[0].name);
        h()->entries[0].name = nullptr;
        ExpectNothingLeft();
    }
}

// Promise: "EASEntry: A caller may put another name"
// Promise: "EASEntry: it is the handle's then"
TEST_F(EasNamesTest, OfManyAttributesCanBeReplaced) {
    for (const int count : {33, 200, 600}) {
        SCOPED_TRACE(count);
        OpenMany(count);
        for (int i = 0; i<count; i += count> 100 ? 7 : 1) {
            std::string& name = image_.attributes[static_cast<std::size_t>(i)].name;
            if (i % 2 == 1) name[0] = 'N';
            h()->entries[i].name = Copy(name);
        }
        if (count == 33) image_.attributes[1].name = "name1", h()->entries[1].name[0] = 'n';
        EXPECT_EQ(0, MAVOEASWriteHeader(h()));
        EXPECT_EQ(image_.Build(), Contents());
        Change(h());
        ExpectNothingLeft();
    }
}

// Promise: "EASEntry: In a larger one the names share a block"
// Promise: "name: NUL-terminated"
// Promise: "entries: attribute table"
TEST_F(EasNamesTest, AreFreedWithTheTableWhicheverOfThemAreStillThere) {
    for (const int count : kFewAndMany) {
        SCOPED_TRACE(count);
        OpenMany(count);
        const int one = TakeAllocations().live;
        const Handle other = Open();
        ASSERT_NE(nullptr, other);
        live_ += TakeAllocations().live - one;
        for (int i = 0; i < count; ++i) {
            Bytes buffer(static_cast<std::size_t>(count));
            ASSERT_EQ(0,
                      MAVOEASUpdateEntry(h(), 0, buffer.data(), static_cast<unsigned>(count), 1));
        }
        EXPECT_THAT(Names(handle_), IsEmpty());
        ExpectNothingLeft();
        EXPECT_EQ(static_cast<std::size_t>(count), Names(other).size());
        EXPECT_EQ(count - 1,
                  MAVOEASSearch(other.get(), ("name" + std::to_string(count - 1)).c_str()));
    }
}

// Promise: "EASHandle: A copy may be used"
TEST_F(EasNamesTest, ACopyOfAHandleIsAsGood) {
    for (const int count : kFewAndMany) {
        SCOPED_TRACE(count);
        OpenMany(count);
        EASHandle copy = *h();
        Change(&copy);
        *h() = copy;
        ExpectNothingLeft();
    }
}

// Promise: "EASHandle: A copy may be used"
TEST_F(EasNamesTest, ACopyOfAHandleCanBeClosedInItsPlace) {
    for (const int count : kFewAndMany) {
        SCOPED_TRACE(count);
        OpenMany(count);
        auto* const copy = static_cast<EASHandle*>(kernel::Allocate(sizeof(EASHandle)));
        *copy = *h();
        kernel::Free(handle_.release());
        handle_.reset(copy);
        Change(h());
        ExpectNothingLeft();
    }
}

// What a stream's table and names may take of the heap when they take no large block.
constexpr unsigned kSmallBlock = 1023;

TEST_F(EasNamesTest, OfALargeStreamTakeNoLargeBlockOfTheHeap) {
    OpenMany(32);
    const Handle small = Open();
    const Handle other_small = Open();
    StreamImage large;
    for (int i = 0; i < 1000; ++i) large.attributes.push_back({NameOfMany(i), {}});
    Fill(large);
    for (int i = 0; i < 3; ++i) {
        TakeAllocations();
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        EXPECT_GE(kSmallBlock, TakeAllocations().largest);
        EXPECT_EQ(NameOfMany(999), Names(handle).back());
        EXPECT_EQ(0, MAVOEASSearch(handle.get(), NameOfMany(0).c_str()));
    }
}

TEST_F(EasNamesTest, OfSeveralLargeStreamsAreApart) {
    OpenMany(600);
    const std::vector<std::string> names = Names(handle_);
    Handle second = Open();
    Handle third = Open();
    Change(second.get());
    EXPECT_EQ(names, Names(handle_));
    EXPECT_EQ(names, Names(third));
    const std::vector<std::string> changed = Names(second);
    handle_ = Open();
    EXPECT_EQ(changed, Names(handle_));
    EXPECT_EQ(changed, Names(second));
    EXPECT_EQ(names, Names(third));
    second.reset();
    third.reset();
    EXPECT_EQ(changed, Names(handle_));
    EXPECT_EQ(1, Write(handle_, "last", "x"));
    EXPECT_EQ(changed.size() + 1, Names(Open()).size());
    ExpectNothingLeft();
}

// Promise: "MAVOEASAllocEntry: 0x200"
TEST_F(EasNamesTest, OfALargeStreamStayWhenItsTableGrows) {
    OpenMany(600);
    TakeAllocations();
    ASSERT_EQ(0, MAVOEASAllocEntry(h(), 100));
    EXPECT_EQ(0u, TakeAllocations().total);
    {
        const FailCall fault("malloc", ENOMEM);
        ASSERT_EQ(-1, MAVOEASAllocEntry(h(), 3000));
        EXPECT_TRUE(fault.fired());
    }
    EXPECT_THAT(TakeCodes(), ElementsAre(0x200));
    EXPECT_EQ(700, h()->capacity);
    EXPECT_EQ(600u, Names(handle_).size());
    ASSERT_EQ(0, MAVOEASAllocEntry(h(), 3000));
    EXPECT_EQ(3700, h()->capacity);
    Handle other = Open();
    EXPECT_EQ(Names(other), Names(handle_));
    for (int i = 600; i < 3700; ++i) ASSERT_EQ(nullptr, h()->entries[i].name) << i;
    Change(h());
    EXPECT_EQ(600u, Names(other).size());
    handle_.reset();
    other.reset();
    TakeAllocations();
    handle_ = Open();
    EXPECT_GE(kSmallBlock, TakeAllocations().largest);  // given back when it was outgrown
    ExpectNothingLeft();
}

// ---- Update entry -------------------------------------------------------------------------------

// Promise: "MAVOEASUpdateEntry: Makes record"
// Promise: "MAVOEASUpdateEntry: The file is only read"
TEST_F(EasEntriesTest, UpdateEntryPutsARecordLastAndItsValueBehindTheOthers) {
    OpenThree();
    const Bytes before = Contents();
    Bytes buffer(11);
    ASSERT_EQ(0, MAVOEASUpdateEntry(h(), 0, buffer.data(), 11, 0));
    EXPECT_EQ(Ascii("seconds3one"), buffer);
    EXPECT_THAT(Names(handle_), ElementsAre("b", "c", "a"));
    const std::vector<HandleState::Entry> expected = {
        {168, 7, 0, 2, "b"}, {175, 1, 0, 2, "c"}, {176, 3, 0, 2, "a"}};
    EXPECT_TRUE(expected == StateOf(*h()).entries);
    EXPECT_EQ(before, Contents());
    EXPECT_EQ(168u, U32At(h()->header, kDataStartAt));
    EXPECT_EQ(11u, U32At(h()->header, kDataLengthAt));
    EXPECT_THAT(TakeWrites(), IsEmpty());
}

TEST_F(EasEntriesTest, UpdateEntryOfTheLastGathersOnly) {
    OpenThree();
    const HandleState before = StateOf(*h());
    Bytes buffer = Repeat('#', 20);
    ASSERT_EQ(0, MAVOEASUpdateEntry(h(), 2, buffer.data(), 20, 0));
    EXPECT_EQ(Ascii("oneseconds3#########"), buffer);
    EXPECT_TRUE(before == StateOf(*h()));
}

// Promise: "MAVOEASUpdateEntry: Makes record"
TEST_F(EasEntriesTest, UpdateEntryDropsARecord) {
    OpenThree();
    const Bytes before = Contents();
    const int live = TakeAllocations().live;
    Bytes buffer = Repeat('#', 6);
    ASSERT_EQ(0, MAVOEASUpdateEntry(h(), 1, buffer.data(), 4, 1));
    EXPECT_EQ(Ascii("one3##"), buffer);
    const std::vector<HandleState::Entry> expected = {{152, 3, 0, 2, "a"}, {155, 1, 0, 2, "c"}};
    EXPECT_TRUE(expected == StateOf(*h()).entries);
    EXPECT_EQ(152u, U32At(h()->header, kDataStartAt));
    EXPECT_EQ(4u, U32At(h()->header, kDataLengthAt));
    EXPECT_EQ(2u, U16At(h()->header, kAttributeCountAt));
    EXPECT_EQ(nullptr, h()->entries[2].name);
    EXPECT_EQ(0u, h()->entries[2].offset + h()->entries[2].length + h()->entries[2].nameLength);
    EXPECT_EQ(before, Contents());
    handle_.reset();
    EXPECT_EQ(live - kBlocksOfThree, TakeAllocations().live);
}

// Promise: "MAVOEASUpdateEntry: bufSize"
// Promise: "MAVOEASUpdateEntry: -1: 0xD00"
// Promise: "MAVOEASUpdateEntry: 0x100"
TEST_F(EasEntriesTest, UpdateEntryRefusesBadArgumentsAndSmallBuffers) {
    OpenThree();
    const HandleState before = StateOf(*h());
    Bytes buffer(100);
    EXPECT_EQ(-1, MAVOEASUpdateEntry(nullptr, 0, buffer.data(), 100, 0));
    EXPECT_EQ(-1, MAVOEASUpdateEntry(h(), 3, buffer.data(), 100, 0));
    EXPECT_EQ(-1, MAVOEASUpdateEntry(h(), 0xFFFFFFFF, buffer.data(), 100, 1));
    h()->fd = -1;
    EXPECT_EQ(-1, MAVOEASUpdateEntry(h(), 0, buffer.data(), 100, 0));
    h()->fd = fd_;
    std::vector<Record> records = TakeRecords();
    EXPECT_EQ(4u, records.size());
    EXPECT_THAT(records, Each(RecordOf(0xD00, "eas_update_entry")));

    EXPECT_EQ(-1, MAVOEASUpdateEntry(h(), 1, buffer.data(), 10, 0));
    EXPECT_EQ(-1, MAVOEASUpdateEntry(h(), 1, buffer.data(), 3, 1));
    EXPECT_EQ(-1, MAVOEASUpdateEntry(h(), 1, buffer.data(), 0, 1));
    records = TakeRecords();
    EXPECT_EQ(3u, records.size());
    EXPECT_THAT(records, Each(RecordOf(0x100, "eas_update_entry")));
    EXPECT_TRUE(before == StateOf(*h()));
    EXPECT_EQ(Repeat(0, 100), buffer);
}

// Promise: "MAVOEASUpdateEntry: 0xA00"
TEST_F(EasEntriesTest, UpdateEntryThatCannotReadChangesNothing) {
    OpenThree();
    const HandleState before = StateOf(*h());
    Bytes buffer(100);
    for (const int remove : {0, 1}) {
        for (const unsigned index : {0u, 1u, 2u}) {
            SCOPED_TRACE(index);
            for (int nth = 1;; ++nth) {
                SCOPED_TRACE(nth);
                const FailNthCall fault(nth, EIO);
                const int result = MAVOEASUpdateEntry(h(), index, buffer.data(), 100, remove);
                if (!fault.fired()) {
                    EXPECT_EQ(0, result);
                    break;
                }
                EXPECT_EQ(-1, result);
                EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_update_entry")));
                EXPECT_TRUE(before == StateOf(*h()));
            }
            Reopen();
        }
    }
}

}  // namespace
}  // namespace mavoea::test

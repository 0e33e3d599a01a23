// The bytes of EA streams on disk: what is read, what is written, and the limits.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <limits>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_fixture.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class EasFormatTest : public StreamTest {};

// ---- New streams --------------------------------------------------------------------------------

TEST_F(EasFormatTest, AnEmptyFileOpensWithoutAttributesAndStaysEmptyUntilItIsWritten) {
    {
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        EXPECT_THAT(Names(handle), IsEmpty());
        EXPECT_EQ(0u, FileSize());
    }
    EXPECT_EQ(0u, FileSize());
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(1, Write(handle, "a", "x"));
    EXPECT_EQ(137u, FileSize());
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "EA stream: 0 | 4 | magic"
// Promise: "EA stream: 4 | 4 | version"
// Promise: "EA stream: 8 | 16 | filler"
// Promise: "EA stream: 24 |"
// Promise: "EA stream: 50 |"
// Promise: "EA stream: 82 |"
// Promise: "EA stream: 84 |"
TEST_F(EasFormatTest, ANewStreamHasItsWholeHeaderInMemory) {
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Hex("00 05 16 07  00 02 00 00  'Mac OS X        '  00 02"
                  "00 00 00 09  00 00 00 32  00 00 00 20"
                  "00 00 00 02  00 00 00 52  00 00 00 00"
                  "00*32  00 00  'ATTR'"
                  "00 00 00 00  00 00 00 00  00 00 00 78  00 00 00 00"
                  "00*12  00 00  00 00"),
              StateOf(*handle).header);
}

// Promise: "mavoea.h: On disk every multi-byte field is big-endian"
// Promise: "EA streams: handle: A stream is"
// Promise: "What is on disk: All multi-byte fields are big-endian"
// Promise: "EA stream: An AppleDouble file"
// Promise: "EA stream: Four regions"
// Promise: "EA stream: 92 |"
// Promise: "EA stream: 96 |"
// Promise: "EA stream: 100 |"
// Promise: "EA stream: 118 |"
// Promise: "EA stream: 120 |"
// Promise: "EA stream: 0 | 4 | offset"
// Promise: "EA stream: 4 | 4 | length"
// Promise: "EA stream: 10 |"
// Promise: "EA stream: The Finder info entry reaches"
// Promise: "EA stream: A stream with the attribute"
// Promise: "EA stream: 00 05 16 07"
// Promise: "EA stream: 26 |"
// Promise: "EA stream: 38 |"
TEST_F(EasFormatTest, OneThreeByteValueUnderAOneLetterNameIsThese139Bytes) {
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(3, Write(handle, "a", "xyz", 0, 0));
    EXPECT_EQ(Hex("00 05 16 07 "         //   0  magic
                  "00 02 00 00 "         //   4  version
                  "'Mac OS X        ' "  //   8  filler
                  "00 02 "               //  24  descriptors
                  "00 00 00 09 "         //  26  Finder info
                  "00 00 00 32 "         //  30  at 50
                  "00 00 00 59 "         //  34  89 bytes, up to the resource fork
                  "00 00 00 02 "         //  38  resource fork
                  "00 00 00 8B "         //  42  at 139
                  "00 00 00 00 "         //  46  empty
                  "00*32 "               //  50  Finder info
                  "00 00 "               //  82  pad
                  "'ATTR' "              //  84
                  "00 00 00 00 "         //  88  debug tag
                  "00 00 00 8B "         //  92  total size
                  "00 00 00 88 "         //  96  data start
                  "00 00 00 03 "         // 100  data length
                  "00*12 "               // 104  reserved
                  "00 00 "               // 116  flags
                  "00 01 "               // 118  attributes
                  "00 00 00 88 "         // 120  value offset
                  "00 00 00 03 "         // 124  value length
                  "00 00 "               // 128  flags
                  "02 'a' 00 "           // 130  name
                  "00*3 "                // 133  padding
                  "'xyz' "),             // 136  value
              Contents());
    EXPECT_EQ(139u, FileSize());
    // The image in memory is the one on disk.
    EXPECT_EQ(Contents(120), StateOf(*handle).header);
}

TEST_F(EasFormatTest, AnEmptyValueAddsNoDataButItsRecordCountsInDataStart) {
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(0, MAVOEASWrite(handle.get(), "a", nullptr, 0, 0, 0));
    EXPECT_EQ(Hex("00 05 16 07  00 02 00 00  'Mac OS X        '  00 02"
                  "00 00 00 09  00 00 00 32  00 00 00 56"
                  "00 00 00 02  00 00 00 88  00 00 00 00"
                  "00*32  00 00  'ATTR'"
                  "00 00 00 00  00 00 00 88  00 00 00 88  00 00 00 00"
                  "00*12  00 00  00 01"
                  "00 00 00 88  00 00 00 00  00 00  02 'a' 00  00*3"),
              Contents());
    EXPECT_EQ(Bytes{}, Read(handle, "a"));
}

// ---- Records ------------------------------------------------------------------------------------

// Promise: "EA stream: A record of the table"
TEST_F(EasFormatTest, RecordsAreRoundedUpToFourBytes) {
    struct Case {
        std::size_t letters;
        std::uint32_t size;
    };
    for (const Case& c : {Case{0, 12}, Case{1, 16}, Case{2, 16}, Case{3, 16}, Case{4, 16},
                          Case{5, 20}, Case{8, 20}, Case{9, 24}, Case{240, 252}, Case{241, 256},
                          Case{242, 256}, Case{253, 268}, Case{254, 268}}) {
        SCOPED_TRACE(c.letters);
        Fill(Bytes{});
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        const std::string name(c.letters, 'n');
        ASSERT_EQ(1, Write(handle, name, "v"));
        EXPECT_EQ(120 + c.size, U32At(handle->header, kDataStartAt));
        EXPECT_EQ((StreamImage{.attributes = {{name, Ascii("v")}}}.Build()), Contents());
        EXPECT_EQ(120 + c.size + 1, FileSize());
    }
}

TEST_F(EasFormatTest, EveryNameLengthIsReadBack) {
    StreamImage image;
    for (std::size_t letters = 0; letters <= 254; ++letters) {
        image.attributes.push_back({std::string(letters, 'n'), Pattern(letters % 5)});
    }
    Fill(image);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    for (const Attribute& attribute : image.attributes) {
        EXPECT_EQ(attribute.value, Read(handle, attribute.name)) << attribute.name.size();
    }
    // Written back, the table is the same, over many staging blocks.
    EXPECT_EQ(0, MAVOEASWriteHeader(handle.get()));
    EXPECT_EQ(image.Build(), Contents());
}

// Promise: "mavoea.h: no character set is assumed"
// Promise: "EA stream: 11 |"
TEST_F(EasFormatTest, NamesAreBytesOfNoCharacterSet) {
    const std::vector<std::string> names = {"\xFF\xFE\x80", "a/b", "\xC3\xA4", "a\x01\n", "A", "a"};
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    StreamImage image;
    for (const std::string& name : names) {
        image.attributes.push_back({name, Ascii(name + "!")});
        ASSERT_EQ(static_cast<int>(name.size()) + 1, Write(handle, name, Ascii(name + "!")));
    }
    EXPECT_EQ(image.Build(), Contents());
    EXPECT_EQ(names, Names(handle));
    EXPECT_EQ(Ascii("A!"), Read(handle, "A"));
    EXPECT_EQ(Ascii("a!"), Read(handle, "a"));
}

TEST_F(EasFormatTest, ANameWithoutItsNulIsKeptAsItIs) {
    StreamImage image{.attributes = {{"abcd", Ascii("1")}, {"e", Ascii("2")}}};
    Bytes bytes = image.Build();
    bytes[image.RecordAt(0) + 11 + 4] = 'X';  // where the NUL was
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_THAT(Names(handle), ElementsAre("abcdX", "e"));
    EXPECT_EQ(Ascii("1"), Read(handle, "abcdX"));
    ASSERT_EQ(1, Write(handle, "e", "3"));
    bytes.back() = '3';
    EXPECT_EQ(bytes, Contents());
}

TEST_F(EasFormatTest, ANameOfNoBytesAtAllTakesTwelve) {
    StreamImage image{.attributes = {{"", Ascii("1")}, {"e", Ascii("2")}}};
    Bytes bytes = image.Build();
    bytes[image.RecordAt(0) + 10] = 0;  // the name length, without even a NUL
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_THAT(Names(handle), ElementsAre("", "e"));
    EXPECT_EQ(Ascii("1"), Read(handle, ""));
    EXPECT_EQ(Ascii("2"), Read(handle, "e"));
    ASSERT_EQ(1, Write(handle, "e", "3"));
    bytes.back() = '3';
    EXPECT_EQ(bytes, Contents());
}

// Promise: "EA stream: A record of the table"
TEST_F(EasFormatTest, PaddingOfRecordsIsSkippedWhateverItHoldsAndWrittenAsZeros) {
    const StreamImage image{.attributes = {{"a", Ascii("1")}, {"b", Ascii("2")}}};
    Bytes bytes = image.Build();
    for (std::size_t record : {0u, 1u}) {
        for (std::size_t at = 13; at < 16; ++at) bytes[image.RecordAt(record) + at] = 0xEE;
    }
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Ascii("2"), Read(handle, "b"));
    ASSERT_EQ(0, MAVOEASWriteHeader(handle.get()));
    EXPECT_EQ(image.Build(), Contents());
}

// ---- What is kept and what is not looked at -----------------------------------------------------

// Promise: "flags: carried through unchanged"
// Promise: "EA stream: 88 |"
// Promise: "EA stream: 104 |"
// Promise: "EA stream: 116 |"
// Promise: "EA stream: 8 | 2 | flags"
TEST_F(EasFormatTest, FieldsThatMeanNothingHereAreKept) {
    StreamImage image{.attributes = {{"a", Ascii("1"), 0xABCD}, {"b", Ascii("22"), 0x8001}},
                      .fork = Pattern(50),
                      .finder_info = Pattern(32, 9)};
    image.magic = 0x11223344;
    image.version = 0x55667788;
    image.filler = Pattern(16, 3);
    image.pad = 0x9A9B;
    image.attribute_magic = Ascii("attr");
    image.debug_tag = 0xDEADBEEF;
    image.reserved = Pattern(12, 5);
    image.flags = 0xF00D;
    Fill(image);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(image.Build(), Contents());
    ASSERT_EQ(3, Write(handle, "c", "333"));
    image.attributes.push_back({"c", Ascii("333"), 0});
    EXPECT_EQ(image.Build(), Contents());
    ASSERT_EQ(1, Write(handle, "a", "9"));
    image.attributes = {
        {"b", Ascii("22"), 0x8001}, {"c", Ascii("333"), 0}, {"a", Ascii("9"), 0xABCD}};
    EXPECT_EQ(image.Build(), Contents());
    ASSERT_EQ(0, MAVOEASRemove(handle.get(), "c"));
    image.attributes.erase(image.attributes.begin() + 1);
    EXPECT_EQ(image.Build(), Contents());
}

TEST_F(EasFormatTest, TheTotalSizeFieldIsNotBelievedButRewritten) {
    StreamImage image{.attributes = {{"a", Ascii("1")}}, .fork = Pattern(40)};
    Bytes bytes = image.Build();
    PutU32(bytes, kTotalSizeAt, 0x7FFFFFFF);
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    ASSERT_EQ(2, Write(handle, "b", "22"));
    image.attributes.push_back({"b", Ascii("22")});
    EXPECT_EQ(image.Build(), Contents());
}

// ---- Descriptors --------------------------------------------------------------------------------

// Promise: "MAVOEASOpen: Returns a handle"
// Promise: "EA stream: Limits"
// Promise: "EA stream: **Damage**"
// Promise: "Streams: A stream whose header"
// Promise: "What may be left over: a stream that is refused"
TEST_F(EasFormatTest, FourteenDescriptorsAreRefusedAndThirteenAreRead) {
    Fill(PlainAppleDouble(Pattern(32), Pattern(20), 14));
    EXPECT_EQ(nullptr, Open());
    EXPECT_THAT(TakeCodes(), ElementsAre(0xD00));
    EXPECT_EQ(-1, EASGetEntryCount(fd_));
    EXPECT_THAT(TakeCodes(), ElementsAre(0xD00));

    Fill(PlainAppleDouble(Pattern(32), Pattern(20), 13));
    EXPECT_EQ(0, EASGetEntryCount(fd_));
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_THAT(Names(handle), IsEmpty());
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(182u, U32At(handle->header, kFinderOffsetAt));
    EXPECT_EQ(Pattern(32), Bytes(handle->header + 50, handle->header + 82));
    EXPECT_EQ(13, U16At(handle->header, kDescriptorCountAt));
}

TEST_F(EasFormatTest, ManyDescriptorsAreRefusedWhateverTheCount) {
    for (const unsigned count : {14u, 255u, 256u, 0x7FFFu, 0xFFFFu}) {
        SCOPED_TRACE(count);
        Bytes bytes = StreamImage{.attributes = {{"a", Ascii("1")}}}.Build();
        PutU16(bytes, kDescriptorCountAt, count);
        Fill(bytes);
        EXPECT_EQ(nullptr, Open());
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_open")));
    }
}

TEST_F(EasFormatTest, AForkDescriptorInFrontIsRewrittenBehindTheFinderInfo) {
    StreamImage image{.attributes = {{"a", Ascii("1")}}, .fork = Pattern(100)};
    image.fork_first = true;
    Fill(image);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(9u, U32At(handle->header, kFinderIdAt));
    EXPECT_EQ(2u, U32At(handle->header, kForkIdAt));
    EXPECT_EQ(Ascii("1"), Read(handle, "a"));
    ASSERT_EQ(1, Write(handle, "a", "2"));
    image.fork_first = false;
    image.attributes[0].value = Ascii("2");
    EXPECT_EQ(image.Build(), Contents());
    ASSERT_EQ(4, Write(handle, "b", "long"));
    image.attributes.push_back({"b", Ascii("long")});
    EXPECT_EQ(image.Build(), Contents());
}

TEST_F(EasFormatTest, DescriptorsAreToldByTheirFullIdAndTheLastOfAnIdWins) {
    // Six descriptors: two that only look like Finder info and fork, then each of them twice.
    const Bytes bytes =
        Hex("00 05 16 07  00 02 00 00  00*16  00 06"
            "00 01 00 09  00 00 00 32  00 00 00 20"
            "02 00 00 02  00 00 00 32  00 00 00 20"
            "00 00 00 09  00 00 00 00  00 00 00 20"
            "00 00 00 02  00 00 00 00  00 00 00 11"
            "00 00 00 02  00 00 00 82  00 00 00 03"
            "00 00 00 09  00 00 00 62  00 00 00 20"
            "'Finder info, all of thirty-two b'  'rsr'");
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Hex("00 00 00 09  00 00 00 62  00 00 00 20"
                  "00 00 00 02  00 00 00 82  00 00 00 03"
                  "'Finder info, all of thirty-two b'"),
              Bytes(handle->header + 26, handle->header + 82));
    EXPECT_EQ(6, U16At(handle->header, kDescriptorCountAt));
}

TEST_F(EasFormatTest, AMissingDescriptorLeavesItsPlaceZero) {
    Bytes bytes = PlainAppleDouble(Pattern(32), {});
    PutU32(bytes, kForkIdAt, 7);
    Fill(bytes);
    {
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        EXPECT_EQ(Repeat(0, 12), Bytes(handle->header + 38, handle->header + 50));
    }
    // Without a Finder info, the bytes that follow are read all the same: nothing but the count of
    // descriptors is checked.
    bytes = StreamImage{.attributes = {{"a", Ascii("1")}}}.Build();
    PutU32(bytes, kFinderIdAt, 7);
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Repeat(0, 12), Bytes(handle->header + 26, handle->header + 38));
    EXPECT_EQ(Bytes(bytes.begin(), bytes.begin() + 32),
              Bytes(handle->header + 50, handle->header + 82));
    EXPECT_EQ(Ascii("1"), Read(handle, "a"));
}

TEST_F(EasFormatTest, WritingTheFinderInfoNeedsItsDescriptor) {
    Bytes bytes = StreamImage{.attributes = {{"a", Ascii("1")}}}.Build();
    PutU32(bytes, kFinderIdAt, 7);
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    const HandleState before = StateOf(*handle);
    EXPECT_EQ(-1, Write(handle, "b", "2"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_get_finderinfo_index")));
    EXPECT_EQ(-1, Write(handle, "a", "2"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_get_finderinfo_index")));
    EXPECT_EQ(bytes, Contents());
    EXPECT_EQ(before, StateOf(*handle));
}

// Promise: "EA stream: **More than two descriptors**"
TEST_F(EasFormatTest, TheCountOfDescriptorsIsWrittenBackAsItWasRead) {
    const Bytes fork = Pattern(30);
    Fill(PlainAppleDouble(Pattern(32, 4), fork, 3));
    StreamImage image{
        .attributes = {{"a", Ascii("xyz")}}, .fork = fork, .finder_info = Pattern(32, 4)};
    image.filler = Repeat(0, 16);
    image.descriptor_count = 3;
    {
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        EXPECT_EQ(3, U16At(handle->header, kDescriptorCountAt));
        ASSERT_EQ(3, Write(handle, "a", "xyz"));
        // The Finder info, which lay at 62, is back at 50.
        EXPECT_EQ(50u, U32At(handle->header, kFinderOffsetAt));
    }
    EXPECT_EQ(image.Build(), Contents());
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Ascii("xyz"), Read(handle, "a"));
}

// Promise: "EA stream: **More than two descriptors**"
TEST_F(EasFormatTest, ThirteenDescriptorsStayReadableThroughEveryRewrite) {
    const Bytes fork = Pattern(60);
    Fill(PlainAppleDouble(Pattern(32, 4), fork, 13));
    StreamImage image{
        .attributes = {{"a", Ascii("xyz")}}, .fork = fork, .finder_info = Pattern(32, 4)};
    image.filler = Repeat(0, 16);
    image.descriptor_count = 13;
    {
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        ASSERT_EQ(3, Write(handle, "a", "xyz"));
    }
    EXPECT_EQ(image.Build(), Contents(image.End()));
    {
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        EXPECT_EQ(Ascii("xyz"), Read(handle, "a"));
        ASSERT_EQ(0, MAVOEASRemove(handle.get(), "a"));
    }
    // 26 + 12 * 13 = 182 bytes have to be there for the descriptors, 120 + 60 are there for the
    // stream.
    image.attributes.clear();
    EXPECT_EQ(image.Build(), Contents(image.End()));
    EXPECT_EQ(182u, FileSize());
    EXPECT_NE(nullptr, Open());
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "EA stream: **Finder info elsewhere"
TEST_F(EasFormatTest, TheAttributeHeaderIsReadAt82WhereverTheFinderInfoLies) {
    StreamImage image{.attributes = {{"a", Ascii("1")}}, .finder_info = Repeat(0xAA, 32)};
    Bytes bytes = image.Build();
    const auto finder_at = static_cast<std::uint32_t>(bytes.size());
    bytes = bytes + Pattern(32);
    PutU32(bytes, kFinderOffsetAt, finder_at);
    PutU32(bytes, kFinderLengthAt, 33);
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Pattern(32), Bytes(handle->header + 50, handle->header + 82));
    EXPECT_EQ(Ascii("1"), Read(handle, "a"));
    // Rewritten, it is where every reader looks for it.
    ASSERT_EQ(1, Write(handle, "a", "2"));
    image.attributes[0].value = Ascii("2");
    image.finder_info = Pattern(32);
    EXPECT_EQ(image.Build(), Contents(image.End()));
}

TEST_F(EasFormatTest, AFinderInfoFarBehindTheTableIsRead) {
    StreamImage image{.attributes = {{"a", Ascii("1")}}};
    Bytes bytes = image.Build() + Repeat(0x55, 20000) + Pattern(32);
    PutU32(bytes, kFinderOffsetAt, bytes.size() - 32);
    Fill(bytes);
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Pattern(32), Bytes(handle->header + 50, handle->header + 82));
    EXPECT_EQ(Ascii("1"), Read(handle, "a"));
}

// ---- AppleDouble files of others ----------------------------------------------------------------

// Promise: "EA stream: **A Finder info entry of 32 bytes**"
TEST_F(EasFormatTest, APlainAppleDoubleFileOpensWithAnEmptyAttributeHeader) {
    const Bytes bytes = PlainAppleDouble(Pattern(32), Pattern(1000));
    Fill(bytes);
    EXPECT_EQ(0, EASGetEntryCount(fd_));
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_THAT(Names(handle), IsEmpty());
    EXPECT_EQ(Bytes(bytes.begin(), bytes.begin() + 82) +
                  Hex("00 00  'ATTR'  00*4  00*4  00 00 00 78  00*4  00*12  00 00  00 00"),
              StateOf(*handle).header);
    EXPECT_GE(handle->capacity, 5);
    EXPECT_EQ(bytes, Contents());
}

// Promise: "EA stream: The first write turns"
// Promise: "EA stream: its fork moves"
TEST_F(EasFormatTest, TheFirstWriteMakesAPlainAppleDoubleFileAWholeStreamAndMovesItsForkFrom82) {
    const Bytes fork = Pattern(1000);
    Fill(PlainAppleDouble(Pattern(32, 6), fork));
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    ASSERT_EQ(3, Write(handle, "a", "xyz"));
    EXPECT_EQ(Hex("00 05 16 07  00 02 00 00  00*16  00 02"
                  "00 00 00 09  00 00 00 32  00 00 00 59"
                  "00 00 00 02  00 00 00 8B  00 00 03 E8") +
                  Pattern(32, 6) +
                  Hex("00 00  'ATTR'  00*4  00 00 00 8B  00 00 00 88  00 00 00 03"
                      "00*12  00 00  00 01"
                      "00 00 00 88  00 00 00 03  00 00  02 'a' 00  00*3  'xyz'") +
                  fork,
              Contents());
}

TEST_F(EasFormatTest, APlainAppleDoubleFileOf82BytesIsEnough) {
    Fill(PlainAppleDouble(Pattern(32), {}));
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(82u, FileSize());
    ASSERT_EQ(1, Write(handle, "a", "1"));
    StreamImage image{.attributes = {{"a", Ascii("1")}}, .finder_info = Pattern(32)};
    image.filler = Repeat(0, 16);
    EXPECT_EQ(image.Build(), Contents());
}

// Mac OS X reserves 3,760 bytes for Finder info and attributes; the fork lies behind them.
// Promise: "EA stream: **Mac OS X leaves"
TEST_F(EasFormatTest, TheSlackThatMacsLeaveIsTakenOutByTheFirstWrite) {
    StreamImage image{.attributes = {{"com.apple.quarantine", Ascii("0001;")}, {"b", Pattern(500)}},
                      .fork = Pattern(286),
                      .finder_info = Pattern(32)};
    image.slack = 3810 - image.TotalSize();
    Bytes bytes = image.Build();
    ASSERT_EQ(3760u, U32At(bytes, kFinderLengthAt));
    ASSERT_EQ(3810u, U32At(bytes, kForkOffsetAt));
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    unsigned start = 0;
    unsigned length = 0;
    ASSERT_EQ(0, EASGetRForkRange(handle.get(), &start, &length));
    EXPECT_EQ(3810u, start);
    EXPECT_EQ(286u, length);

    ASSERT_EQ(1, Write(handle, "c", "1"));
    image.slack = 0;
    image.attributes.push_back({"c", Ascii("1")});
    EXPECT_EQ(image.Build(), Contents(image.End()));
    EXPECT_EQ(3810u + 286u, FileSize());  // a write leaves the file as long as it was

    ASSERT_EQ(0, MAVOEASRemove(handle.get(), "c"));
    image.attributes.pop_back();
    EXPECT_EQ(image.Build(), Contents());  // a removal cuts it
}

TEST_F(EasFormatTest, AMacsEmptyFinderAreaWithoutAttributesIsAStream) {
    StreamImage image{.fork = Pattern(286), .finder_info = Pattern(32)};
    image.slack = 3810 - 120;
    Fill(image);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_THAT(Names(handle), IsEmpty());
    ASSERT_EQ(3, Write(handle, "a", "xyz"));
    image.slack = 0;
    image.attributes = {{"a", Ascii("xyz")}};
    EXPECT_EQ(image.Build(), Contents(image.End()));
}

// ---- Empty values -------------------------------------------------------------------------------

class EasEmptyValueTest : public EasFormatTest {
 protected:
    // Four attributes of which the third is empty and has the offset 0, as Macs write it.
    EasEmptyValueTest() {
        Bytes bytes = image_.Build();
        PutU32(bytes, image_.RecordAt(2), 0);
        Fill(bytes);
        handle_ = Open();
    }

    StreamImage image_{.attributes = {{"one", Ascii("1")},
                                      {"two", Ascii("22")},
                                      {"three", {}},
                                      {"four", Ascii("4444")}},
                       .fork = Pattern(70)};
    Handle handle_;
};

// Promise: "EA stream: **A record of an empty value**"
TEST_F(EasEmptyValueTest, ReadsAsEmpty) {
    ASSERT_NE(nullptr, handle_);
    EXPECT_EQ(Bytes{}, Read(handle_, "three"));
    EXPECT_EQ(Ascii("4444"), Read(handle_, "four"));
}

TEST_F(EasEmptyValueTest, TakesItsPlaceInTheTableWhenAnotherIsRewritten) {
    ASSERT_NE(nullptr, handle_);
    ASSERT_EQ(2, Write(handle_, "two", "zz"));
    image_.attributes = {
        {"one", Ascii("1")}, {"three", {}}, {"four", Ascii("4444")}, {"two", Ascii("zz")}};
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEmptyValueTest, TakesItsPlaceInTheTableWhenOneIsAdded) {
    ASSERT_NE(nullptr, handle_);
    ASSERT_EQ(2, Write(handle_, "five", "55"));
    image_.attributes.push_back({"five", Ascii("55")});
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEmptyValueTest, TakesItsPlaceInTheTableWhenOneIsRemoved) {
    ASSERT_NE(nullptr, handle_);
    ASSERT_EQ(0, MAVOEASRemove(handle_.get(), "one"));
    image_.attributes.erase(image_.attributes.begin());
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEmptyValueTest, IsRemoved) {
    ASSERT_NE(nullptr, handle_);
    ASSERT_EQ(0, MAVOEASRemove(handle_.get(), "three"));
    image_.attributes.erase(image_.attributes.begin() + 2);
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEmptyValueTest, IsFilled) {
    ASSERT_NE(nullptr, handle_);
    ASSERT_EQ(5, Write(handle_, "three", "33333"));
    image_.attributes = {{"one", Ascii("1")},
                         {"two", Ascii("22")},
                         {"four", Ascii("4444")},
                         {"three", Ascii("33333")}};
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasEmptyValueTest, GrowsByTruncation) {
    ASSERT_NE(nullptr, handle_);
    ASSERT_EQ(0, MAVOEASTruncate(handle_.get(), "three", 3));
    image_.attributes = {{"one", Ascii("1")},
                         {"two", Ascii("22")},
                         {"four", Ascii("4444")},
                         {"three", Repeat(0, 3)}};
    // The fork stays where it was, so the grown value covers its first bytes.
    const Bytes fork = image_.fork;
    image_.fork.assign(fork.begin() + 3, fork.end());
    Bytes expected = image_.Build();
    PutU32(expected, kForkLengthAt, 70);
    EXPECT_EQ(expected, Contents());
}

TEST_F(EasEmptyValueTest, LeadsTheTable) {
    StreamImage image{.attributes = {{"none", {}}, {"one", Ascii("1")}}};
    for (const std::uint32_t offset : {0u, 0xFFFFFFFFu, 5000u}) {
        SCOPED_TRACE(offset);
        Bytes bytes = image.Build();
        PutU32(bytes, image.RecordAt(0), offset);
        Fill(bytes);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        ASSERT_EQ(0, MAVOEASRemove(handle_.get(), "one"));
        EXPECT_EQ((StreamImage{.attributes = {{"none", {}}}}.Build()), Contents());
    }
}

// ---- Limits -------------------------------------------------------------------------------------

// Promise: "EA streams: attributes: Names are compared"
// Promise: "EA streams: attributes: What would pass"
// Promise: "How long names can be: of an attribute in a stream"
TEST_F(EasFormatTest, ANameHas254BytesAtMost) {
    StreamImage image{.attributes = {{"a", Ascii("1")}}, .fork = Pattern(20)};
    Fill(image);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    const HandleState before = StateOf(*handle);
    for (const std::size_t letters : {255u, 256u, 257u, 511u, 100000u}) {
        SCOPED_TRACE(letters);
        EXPECT_EQ(-1, Write(handle, std::string(letters, 'n'), "2"));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write")));
        EXPECT_EQ(before, StateOf(*handle));
        EXPECT_EQ(image.Build(), Contents());
    }
    const std::string longest(254, 'n');
    ASSERT_EQ(1, Write(handle, longest, "2"));
    image.attributes.push_back({longest, Ascii("2")});
    EXPECT_EQ(image.Build(), Contents());
    EXPECT_EQ(255, handle->entries[1].nameLength);
}

class EasManyAttributesTest : public EasFormatTest {
 protected:
    static std::string Name(unsigned number) {
        char name[8];
        snprintf(name, sizeof name, "%04x", number);
        return name;
    }
};

// Promise: "EA streams: attributes: a stream holds"
// Promise: "EA streams: attributes: What would pass"
// Promise: "EA stream: Limits"
TEST_F(EasManyAttributesTest, AStreamHolds65535AndTheNextIsRefused) {
    StreamImage image;
    image.fork = Pattern(100);
    for (unsigned i = 0; i < 65535; ++i) image.attributes.push_back({Name(i), {}});
    image.attributes[0x1234].value = Ascii("value");
    const Bytes bytes = image.Build();
    Fill(bytes);
    EXPECT_EQ(65535, EASGetEntryCount(fd_));
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(65535u, Names(handle).size());
    EXPECT_EQ(Ascii("value"), Read(handle, "1234"));

    EXPECT_EQ(-1, Write(handle, "another", "1"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write")));
    EXPECT_TRUE(bytes == Contents());
    EXPECT_EQ(65535, U16At(handle->header, kAttributeCountAt));

    // One that is there can be rewritten, and one in place of another added.
    ASSERT_EQ(3, Write(handle, "0000", "new"));
    ASSERT_EQ(0, MAVOEASRemove(handle.get(), "0001"));
    ASSERT_EQ(1, Write(handle, "another", "1"));
    image.attributes.erase(image.attributes.begin(), image.attributes.begin() + 2);
    image.attributes.push_back({"0000", Ascii("new")});
    image.attributes.push_back({"another", Ascii("1")});
    EXPECT_TRUE(image.Build() == Contents());
    EXPECT_EQ(-1, Write(handle, "yet another", "1"));
    EXPECT_THAT(TakeCodes(), ElementsAre(0xD00));
}

class EasFourGigabytesTest : public EasFormatTest {
 protected:
    static constexpr std::uint64_t kLimit = std::uint64_t{1} << 32;

    // A stream with a hole for a fork, so long that the file ends at `end`.
    void FillUpTo(std::uint64_t end) {
        Bytes head = image_.Build();
        PutU32(head, kForkLengthAt, end - head.size());
        Fill(head);
        ASSERT_EQ(0, ftruncate(fd_, static_cast<off_t>(end)));
        head_ = head;
    }

    StreamImage image_{.attributes = {{"a", Ascii("xyz")}}};
    Bytes head_;
};

// Promise: "EA streams: attributes: a stream holds"
// Promise: "EA stream: Limits"
TEST_F(EasFourGigabytesTest, AreReachedButNotPassed) {
    FillUpTo(kLimit);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    // Of equal size: the fork stays where it is.
    ASSERT_EQ(3, Write(handle, "a", "XYZ"));
    head_[139 - 3] = 'X', head_[139 - 2] = 'Y', head_[139 - 1] = 'Z';
    EXPECT_EQ(head_, Contents(139));

    const HandleState before = StateOf(*handle);
    TakeCalls();
    EXPECT_EQ(-1, Write(handle, "b", Bytes{}));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write")));
    EXPECT_EQ(-1, Write(handle, "a", "wxyz"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write")));
    EXPECT_EQ(-1, MAVOEASTruncate(handle.get(), "a", 4));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_truncate")));
    EXPECT_THAT(TakeWrites(), IsEmpty());
    EXPECT_EQ(head_, Contents(139));
    EXPECT_EQ(kLimit, FileSize());
    EXPECT_EQ(before, StateOf(*handle));
}

// Promise: "EA streams: attributes: What would pass"
TEST_F(EasFourGigabytesTest, AreNotPassedByOffsetsAndSizesThatWrapIn32Bits) {
    image_.fork = Pattern(10);
    Fill(image_);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    const HandleState before = StateOf(*handle);
    TakeAllocations();
    constexpr unsigned kMost = std::numeric_limits<unsigned>::max();
    for (const char* name : {"a", "new"}) {
        SCOPED_TRACE(name);
        for (const unsigned offset : {kMost, kMost - 1, kMost - 100, kMost - 10}) {
            SCOPED_TRACE(offset);
            EXPECT_EQ(-1, Write(handle, name, "1234567890123456", offset));
            EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write")));
        }
        Bytes some(1);
        EXPECT_EQ(
            -1, MAVOEASWrite(handle.get(), name, some.data(), 0x80000000u, 0, EAS_WRITE_OVERWRITE));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write")));
        EXPECT_EQ(-1,
                  MAVOEASWrite(handle.get(), name, some.data(), kMost, kMost, EAS_WRITE_OVERWRITE));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_write")));
    }
    EXPECT_EQ(-1, MAVOEASTruncate(handle.get(), "a", kMost));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_truncate")));
    EXPECT_LT(TakeAllocations().total, 65536u);
    EXPECT_EQ(image_.Build(), Contents());
    EXPECT_EQ(before, StateOf(*handle));
}

}  // namespace
}  // namespace mavoea::test

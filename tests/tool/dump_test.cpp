// What the tool shows of metadata files, and what it finds wrong with damaged ones.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <random>

#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::UnorderedElementsAre;

// Plenty for the program, and far too little for what damaged files declare.
constexpr Limits kLittleMemory = {.memory = std::size_t{512} << 20};

// Two attributes, Finder info and a fork:
//     0  header, entries of 50..172 and 172..176
//   120  "a" (16 bytes), "two words" (24 bytes)
//   160  "xyz", "12345678" and 1 more
//   172  "fork"
StreamImage Sample() {
    return {.attributes = {{"a", Ascii("xyz")}, {"two words", Ascii("123456789"), 0x0102}},
            .fork = Ascii("fork"),
            .finder_info = Ascii("TEXTttxt") + Bytes(24)};
}

class DumpTest : public ::testing::Test {
 protected:
    ToolResult Dump(const Bytes& bytes, const Arguments& more = {}) const {
        WriteFile(path_, bytes);
        Arguments arguments = {"dump", path_};
        arguments.insert(arguments.end(), more.begin(), more.end());
        return RunTool(arguments);
    }

    // The lines of the text that begin with "violation: ", without it; the exit status and the
    // message must go with them, and --json must have the same.
    std::vector<std::string> Lines(const Bytes& bytes, const std::string& kind) const {
        const ToolResult text = Dump(bytes);
        const auto json = Dump(bytes, {"--json"}).json();
        const std::vector<std::string> violations = json["violations"];
        EXPECT_EQ(violations.empty() ? 0 : 2, text.status);
        if (!violations.empty()) {
            EXPECT_THAT(text.err, HasSubstr("the layout is violated in " +
                                            std::to_string(violations.size()) + " place"));
        }
        const std::vector<std::string> lines = json[kind + "s"];
        for (const std::string& line : lines) {
            EXPECT_THAT(text.out, HasSubstr(kind + ": " + line + "\n"));
        }
        return lines;
    }
    std::vector<std::string> Violations(const Bytes& bytes) const {
        return Lines(bytes, "violation");
    }
    std::vector<std::string> Notes(const Bytes& bytes) const { return Lines(bytes, "note"); }

    // The sample with a field changed.
    static Bytes With32(std::size_t at, std::uint32_t value) {
        Bytes bytes = Sample().Build();
        PutU32(bytes, at, value);
        return bytes;
    }
    static Bytes With16(std::size_t at, std::uint32_t value) {
        Bytes bytes = Sample().Build();
        PutU16(bytes, at, value);
        return bytes;
    }

    TempDir dir_;
    std::string path_ = dir_ / "stream";
};

// ---- Good files ---------------------------------------------------------------------------------

TEST_F(DumpTest, EveryFieldOfAStreamIsShown) {
    const ToolResult result = Dump(Sample().Build());
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(path_ +
                  ": EA stream, 176 bytes\n"
                  "magic           0x00051607\n"
                  "version         0x00020000\n"
                  "filler          4d6163204f5320582020202020202020 \"Mac OS X        \"\n"
                  "entries         2\n"
                  "  0  id 9 (Finder info)  offset 50  length 122\n"
                  "  1  id 2 (resource fork)  offset 172  length 4\n"
                  "Finder info     5445585474747874"
                  "000000000000000000000000000000000000000000000000\n"
                  "pad             0x0000\n"
                  "attribute magic 0x41545452\n"
                  "debug tag       0x00000000\n"
                  "total size      172\n"
                  "data start      160\n"
                  "data length     12\n"
                  "reserved        000000000000000000000000\n"
                  "flags           0x0000\n"
                  "attributes      2\n"
                  "  0  offset 160  length 3  flags 0x0000  name size 2  \"a\"\n"
                  "  1  offset 163  length 9  flags 0x0102  name size 10  \"two words\"\n"
                  "resource fork   offset 172  length 4\n",
              result.out);
}

TEST_F(DumpTest, EveryFieldIsInJson) {
    StreamImage image = Sample();
    image.pad = 0x0102;
    image.debug_tag = 0x03040506;
    image.reserved = Hex("000102030405060708090A0B");
    image.flags = 0x0708;
    image.attributes[0].name = "\xFF";
    const auto json = Dump(image.Build(), {"--json"}).json();
    const auto expected = nlohmann::json::parse(R"({
        "kind": "EA stream", "size": 176,
        "header": {"magic": 333319, "version": 131072,
                   "filler": "4d6163204f5320582020202020202020", "entryCount": 2},
        "entries": [{"id": 9, "name": "Finder info", "offset": 50, "length": 122},
                    {"id": 2, "name": "resource fork", "offset": 172, "length": 4}],
        "finderInfo": "5445585474747874000000000000000000000000000000000000000000000000",
        "attributeHeader": {"pad": 258, "magic": 1096045650, "debugTag": 50595078,
                            "totalSize": 172, "dataStart": 160, "dataLength": 12,
                            "reserved": "000102030405060708090a0b", "flags": 1800, "count": 2},
        "attributes": [{"name": "\ufffd", "nameHex": "ff", "offset": 160, "length": 3, "flags": 0,
                        "nameSize": 2},
                       {"name": "two words", "offset": 163, "length": 9, "flags": 258,
                        "nameSize": 10}],
        "resourceFork": {"offset": 172, "length": 4},
        "notes": [], "violations": []})");
    auto without_file = json;
    without_file.erase("file");
    EXPECT_EQ(expected, without_file);
    EXPECT_EQ(path_, json["file"]);
}

TEST_F(DumpTest, APlainFileHasNoAttributeArea) {
    const ToolResult result = Dump(PlainAppleDouble(Bytes(32), {}));
    EXPECT_THAT(result, Succeeded());
    EXPECT_THAT(result.out, HasSubstr(": plain AppleDouble file, 82 bytes\n"));
    EXPECT_THAT(result.out, HasSubstr("resource fork   none\n"));
    EXPECT_THAT(result.out, Not(HasSubstr("data start")));
}

TEST_F(DumpTest, AnEmptyFileIsANewStream) {
    EXPECT_THAT(Violations({}), IsEmpty());
    EXPECT_THAT(Notes({}),
                ElementsAre("the file is empty: a new stream, to which nothing has been written"));
}

TEST_F(DumpTest, WhatIsUnusualButAllowedIsANote) {
    StreamImage image = Sample();
    image.gap = 256;
    image.slack = 10;
    EXPECT_THAT(Violations(image.Build()), IsEmpty());
    EXPECT_THAT(Notes(image.Build()),
                ElementsAre("10 unused bytes between the values and the total size",
                            "256 unused bytes between the attribute table and the values"));
    EXPECT_THAT(Notes(Sample().Build() + Bytes(7)),
                ElementsAre("7 bytes behind all that the file declares"));
    EXPECT_THAT(Notes(With32(kForkIdAt, 5)), ElementsAre("no resource fork entry"));

    image = Sample();
    image.fork.clear();
    Bytes bytes = image.Build();
    PutU32(bytes, kForkOffsetAt, 82);
    EXPECT_THAT(Violations(bytes), IsEmpty());
    EXPECT_THAT(Notes(bytes),
                ElementsAre("the resource fork is at 82, not at the total size 172; it is empty"));
}

TEST_F(DumpTest, TheOffsetOfAnEmptyValueMeansNothing) {
    StreamImage image = Sample();
    image.attributes[0].value.clear();
    Bytes bytes = image.Build();
    PutU32(bytes, image.RecordAt(0), 0);
    EXPECT_THAT(Violations(bytes), IsEmpty());
}

// ---- Damaged files ------------------------------------------------------------------------------

// Promise: "Streams: `mavoea dump FILE`"
// Promise: "What may be left over: a stream that is refused"
TEST_F(DumpTest, EachViolationIsToldInItsOwnWords) {
    const std::size_t first = 120;   // record of "a"
    const std::size_t second = 136;  // record of "two words"

    EXPECT_THAT(Violations(With32(0, 0x00051600)),
                ElementsAre("the magic is 0x00051600, not 0x00051607: no AppleDouble file"));
    EXPECT_THAT(Violations(With32(4, 0x00010000)),
                ElementsAre("the version is 0x00010000, not 0x00020000"));
    EXPECT_THAT(Violations(With32(kAttributeMagicAt, 0x41545458)),
                ElementsAre("the attribute header's magic is 0x41545458, not 0x41545452: its "
                            "attributes are not read"));
    EXPECT_THAT(Violations(With32(kFinderLengthAt, 121)),
                ElementsAre("the Finder info entry ends at 171, not at the total size 172"));
    EXPECT_THAT(Violations(With32(kFinderLengthAt, 31)),
                ElementsAre("entry 0 (Finder info): 31 bytes, fewer than 32"));
    EXPECT_THAT(
        Violations(With32(kFinderLengthAt, 123)),
        UnorderedElementsAre(
            "entry 1 (resource fork): bytes 172 to 175 overlap entry 0 (Finder info), bytes 50 to "
            "172",
            "the Finder info entry ends at 173, not at the total size 172"));
    EXPECT_THAT(Violations(With32(kTotalSizeAt, 171)),
                UnorderedElementsAre("the Finder info entry ends at 172, not at the total size 171",
                                     "the total size 171 is less than the values' end at 172",
                                     "the resource fork is at 172, not at the total size 171"));
    EXPECT_THAT(Violations(With32(kTotalSizeAt, 177)),
                UnorderedElementsAre("the Finder info entry ends at 172, not at the total size 177",
                                     "the total size 177 passes the end of the file at 176",
                                     "the resource fork is at 172, not at the total size 177"));
    EXPECT_THAT(
        Violations(With32(kDataStartAt, 159)),
        UnorderedElementsAre(
            "the values begin at 159, inside the attribute table, which ends at 160",
            "attribute 0 \"a\": the value is at 160, not at 159 behind the one before",
            "attribute 1 \"two words\": the value is at 163, not at 162 behind the one before"));
    EXPECT_THAT(Violations(With32(kDataLengthAt, 11)),
                ElementsAre("the values' lengths add up to 12, the data length is 11"));
    EXPECT_THAT(Violations(With32(kForkLengthAt, 5)),
                ElementsAre("entry 1 (resource fork): bytes 172 to 176 pass the end of the file at "
                            "176"));
    EXPECT_THAT(Violations(With32(kForkOffsetAt, 171)),
                UnorderedElementsAre(
                    "entry 1 (resource fork): bytes 171 to 174 overlap entry 0 (Finder info), "
                    "bytes 50 to 171",
                    "the resource fork is at 171, not at the total size 172"));
    EXPECT_THAT(Violations(With32(kForkIdAt, 9)),
                ::testing::Contains("entry 1 (Finder info): the same kind a second time, which "
                                    "hides the first"));
    EXPECT_THAT(Violations(With32(first, 161)),
                ElementsAre("attribute 0 \"a\": the value is at 161, not at 160 behind the one "
                            "before"));
    EXPECT_THAT(Violations(With32(second + 4, 0xFFFFFFFF)),
                UnorderedElementsAre(
                    "attribute 1 \"two words\": the value, bytes 163 to 4294967457, passes the "
                    "end of the file at 176",
                    "the values' lengths add up to 4294967298, the data length is 12"));
    EXPECT_THAT(
        Violations(With16(kAttributeCountAt, 3)),
        ::testing::Contains("the values' lengths add up to 12, the data length is 12").Times(0));
    EXPECT_THAT(Violations(With16(kDescriptorCountAt, 14)),
                ::testing::Contains("14 entries are declared; a stream of more than 13 is not "
                                    "opened"));
    EXPECT_THAT(Violations(With16(kDescriptorCountAt, 0xFFFF)),
                ::testing::Contains("the file ends inside its descriptors: 12 of 65535 are there"));
}

TEST_F(DumpTest, AnEntryInsideTheHeaderIsAViolation) {
    Bytes bytes = PlainAppleDouble(Bytes(32), Ascii("fork"));
    PutU32(bytes, kForkOffsetAt, 10);
    EXPECT_THAT(Violations(bytes),
                ElementsAre("entry 1 (resource fork): bytes 10 to 13 begin inside the header, "
                            "which ends at 50"));
}

TEST_F(DumpTest, ATableThatTheFileEndsInIsAViolation) {
    EXPECT_THAT(Violations(With16(kAttributeCountAt, 0xFFFF)),
                ::testing::Contains(
                    ::testing::ContainsRegex("the file ends inside its attribute table: [0-9]+ of "
                                             "65535 records are there")));
}

TEST_F(DumpTest, NamesMustEndAndDiffer) {
    StreamImage image = Sample();
    image.attributes[1] = {"a", Ascii("123456789")};
    EXPECT_THAT(Violations(image.Build()),
                ElementsAre("attribute 1 \"a\": the same name as attribute 0, which it hides"));

    Bytes bytes = Sample().Build();
    bytes[120 + 11 + 1] = 'b';  // the NUL behind "a"
    EXPECT_THAT(Violations(bytes),
                ElementsAre("attribute 0 \"ab\": the name does not end with a NUL"));
    bytes = Sample().Build();
    bytes[136 + 11 + 3] = 0;  // the blank
    EXPECT_THAT(Violations(bytes), ElementsAre("attribute 1 \"two\": a NUL inside the name"));
    bytes = Sample().Build();
    bytes[120 + 11] = 0;
    EXPECT_THAT(Violations(bytes), ElementsAre("attribute 0 \"\": a NUL inside the name"));
}

// ---- Any bytes ----------------------------------------------------------------------------------

TEST_F(DumpTest, EveryTruncationIsSeenAndSurvived) {
    const Bytes whole = Sample().Build();
    for (std::size_t size = 1; size < whole.size(); size += SeriesStep()) {
        SCOPED_TRACE(size);
        const Bytes part(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size));
        const ToolResult result = Dump(part);
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.out, HasSubstr("violation: "));
    }
    const Bytes part(whole.begin(), whole.begin() + 25);
    EXPECT_THAT(Violations(part), ElementsAre("the file ends inside its header: 25 of 26 bytes"));
}

TEST_F(DumpTest, RandomBytesBehindAGoodHeaderAreSurvived) {
    std::mt19937 random(20240611);
    for (std::size_t round = 0; round < 150; round += SeriesStep()) {
        SCOPED_TRACE(round);
        Bytes bytes(random() % 400);
        for (std::uint8_t& byte : bytes) byte = static_cast<std::uint8_t>(random());
        // Some are no AppleDouble at all, some go wrong in their entries, the others in the area.
        const Bytes good = Sample().Build();
        const std::size_t kept =
            std::min<std::size_t>(bytes.size(), round % 3 == 0 ? 0 : (round % 3 == 1 ? 26 : 92));
        std::copy_n(good.begin(), kept, bytes.begin());
        const ToolResult result = Dump(bytes, round % 2 == 0 ? Arguments{"--json"} : Arguments{});
        EXPECT_THAT(result.status, ::testing::AnyOf(0, 2)) << result.err;
    }
}

TEST_F(DumpTest, ASampleWithOneByteChangedIsSurvived) {
    const Bytes whole = Sample().Build();
    for (std::size_t at = 0; at < 160; at += SeriesStep()) {
        SCOPED_TRACE(at);
        Bytes bytes = whole;
        bytes[at] ^= 0xFF;
        EXPECT_THAT(Dump(bytes).status, ::testing::AnyOf(0, 2));
    }
}

TEST_F(DumpTest, HostileLengthsTakeNoMemory) {
    Bytes bytes = Sample().Build();
    for (const std::size_t at : {34U, 46U, 92U, 96U, 100U, 124U, 140U}) {
        PutU32(bytes, at, 0xFFFFFFFF);
    }
    PutU16(bytes, kDescriptorCountAt, 2);
    PutU16(bytes, kAttributeCountAt, 0xFFFF);
    WriteFile(path_, bytes);
    EXPECT_EQ(2, RunTool({"dump", path_}, {}, kLittleMemory).status);
}

TEST_F(DumpTest, AForkOfManyGigabytesIsNotRead) {
    WriteFile(path_, With32(kForkLengthAt, 0xF0000000));
    if (::truncate(path_.c_str(), 172 + off_t{0xF0000000}) != 0) {
        GTEST_SKIP() << "the file system takes no sparse files of 4 GB";
    }
    EXPECT_THAT(RunTool({"dump", path_}, {}, kLittleMemory), Succeeded());
}

TEST_F(DumpTest, WhatIsNoRegularFileIsRefused) {
    const std::string message =
        ": not a regular file; name a metadata file, mavoea where PATH "
        "has them";
    EXPECT_THAT(RunTool({"dump", dir_.path()}), Failed(2, dir_.path() + message));
    ASSERT_EQ(0, ::mkfifo((dir_ / "fifo").c_str(), 0600));
    EXPECT_THAT(RunTool({"dump", dir_ / "fifo"}), Failed(2, dir_ / "fifo" + message));
    EXPECT_THAT(RunTool({"dump", dir_ / "none"}),
                Failed(1, dir_ / "none" + ": No such file or directory; check the path"));
}

}  // namespace
}  // namespace mavoea::test

// Objects into AppleDouble, AppleSingle, MacBinary and BinHex files, and out of them. The bytes of
// the MacBinary and the BinHex file are those that other programs make of the same.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "tests/support/mac_files.h"
#include "tests/support/process.h"
#include "tests/tool/holdings.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";
const std::string kColour = "com.example.colour";
const std::string kLocked = "mavoea.locked";

const char* const kFormats[] = {"appledouble", "applesingle", "macbinary", "binhex"};
const char* const kFormatsWithData[] = {"applesingle", "macbinary", "binhex"};

const Bytes kData = Hex("'hello' 0D*6 'world' 90 90");
const Bytes kForkValue = Ascii("the fork");
const Bytes kTypeOnly = Hex("'TEXTttxt' 40 40 00*22");
const Bytes kInfo = Hex("'TEXTttxt' 40 01 00 01 00 02 00 03 00*8 7E 81 00*6");
const Bytes kComment = Ascii("a comment");
const Bytes kDates = Hex("FB 6D 0C 01 FB 6D 0C 02 80 00 00 00 80 00 00 00");  // in July 1997

const Bytes kMacBinary =
    Hex("00 0A 'letter.txt' 00*53 'TEXTttxt' 40 00 00 01 00 02 00 03 01 00 "
        "00 00 00 12 00 00 00 08 B0 00 00 01 B0 00 00 02 00 09 01 'mBIN' 7E 81 "
        "00*8 00*4 00 00 82 81 10 01 00 00") +
    kData + Repeat(0, 110) + kForkValue + Repeat(0, 120) + kComment + Repeat(0, 119);
const Bytes kBinHex = Ascii(
    "(This file must be converted with BinHex 4.0)\n"
    ":#QaPG(4PFLjdH(3!9%9B9(4dH(4!3!!!!\")!!!!)f8*SC@aXE`f3\"RG[FQaNN!#\n"
    "3!25-G'KP)'C[FQ[aR!:\n");
const Bytes kAppleSingle = Hex("00 05 16 00 00 02 00 00 00*16 00 04 "
                               "00 00 00 03 00 00 00 4A 00 00 00 0A "
                               "00 00 00 09 00 00 00 54 00 00 00 20 "
                               "00 00 00 01 00 00 00 74 00 00 00 12 "
                               "00 00 00 02 00 00 00 86 00 00 00 08 "
                               "'letter.txt'") +
                           kTypeOnly + kData + kForkValue;
const Bytes kAppleDouble = ClassicFile(kTypeOnly, kForkValue).bytes;

// A directory of a type, with a file in it.
class Share {
 public:
    explicit Share(std::string type) : type_(std::move(type)) { WriteFile(file(), kData); }

    const std::string& path() const { return dir_.path(); }
    const std::string& type() const { return type_; }
    std::string file() const { return dir_ / "letter.txt"; }
    std::string other() const { return dir_ / "other.txt"; }
    std::string archive() const { return outside_ / "archive"; }
    std::vector<std::string> NamesOutside() const { return NamesIn(outside_.path()); }

    ToolResult Run(Arguments arguments, Limits limits = {}) const {
        arguments.insert(arguments.begin(), {"--volume", path() + '=' + type_});
        return RunTool(arguments, {}, limits);
    }
    void Set(const std::string& name, const Bytes& value) const {
        WriteFile(outside_ / "value", value);
        EXPECT_THAT(Run({"set", file(), name, "--file", outside_ / "value"}), Succeeded()) << name;
        unlink((outside_ / "value").c_str());
    }
    Bytes Get(const std::string& path, const std::string& name) const {
        return Run({"get", path, name}).bytes();
    }
    // Comment and dates, which no other command sets.
    void SetEntries(const Entries& entries) const {
        WriteFile(outside_ / "entries", AppleDoubleOf(entries));
        EXPECT_EQ(0, Run({"import", outside_ / "entries", file()}).status);
        unlink((outside_ / "entries").c_str());
    }
    ToolResult Export(const std::string& format) const {
        unlink(archive().c_str());
        return Run({"export", "--format", format, file(), archive()});
    }
    ToolResult Import(const Bytes& bytes, const std::string& path) const {
        WriteFile(archive(), bytes);
        return Run({"import", archive(), path});
    }

 private:
    TempDir dir_;
    TempDir outside_;
    std::string type_;
};

std::string NotAll(const Share& share, const std::string& items) {
    return share.file() + ": not all of its metadata arrived at " + share.archive() + ": " + items +
           "; see what it is with: mavoea list -l PATH";
}

class ExportTest : public ::testing::TestWithParam<const char*> {
 protected:
    void SetUp() override {
        ASSERT_EQ(0, setenv("TZ", "UTC0", 1));
        const std::string type = GetParam();
        if (type != "0") MAVOEA_SKIP_UNLESS_ROOT();
        if (type != "0" && type != "1") MAVOEA_SKIP_WITHOUT_ATTRIBUTES(share_.path());
    }

    Share share_{GetParam()};
};
INSTANTIATE_TEST_SUITE_P(Types, ExportTest, ::testing::Values("0", "1", "2", "samba"),
                         [](const auto& tested) { return std::string("Type_") + tested.param; });

// ---- Bytes --------------------------------------------------------------------------------------

TEST_P(ExportTest, EachFormatHasItsBytes) {
    share_.Set(kFinderInfo, kTypeOnly);
    share_.Set(kFork, kForkValue);
    const std::pair<const char*, Bytes> formats[] = {
        {"appledouble", kAppleDouble}, {"applesingle", kAppleSingle}, {"binhex", kBinHex}};
    for (const auto& [format, bytes] : formats) {
        EXPECT_THAT(share_.Export(format), Succeeded()) << format;
        EXPECT_EQ(ReadMacFile(bytes), ReadMacFile(ReadFile(share_.archive())));
        // A volume of "._" files has the object's own, which goes as it is.
        if (std::string("appledouble") != format) {
            EXPECT_EQ(bytes, ReadFile(share_.archive())) << format;
        }
    }
}

TEST_P(ExportTest, MacBinaryHasCommentDatesAndLock) {
    share_.Set(kFinderInfo, kInfo);
    share_.Set(kFork, kForkValue);
    share_.SetEntries({{kCommentEntry, kComment}, {kDatesEntry, kDates}});
    ASSERT_THAT(share_.Run({"lock", share_.file()}), Succeeded());
    EXPECT_THAT(share_.Export("macbinary"), Succeeded());
    EXPECT_EQ(kMacBinary, ReadFile(share_.archive()));
}

TEST_P(ExportTest, MacBinaryIsReadWhole) {
    EXPECT_THAT(share_.Import(kMacBinary, share_.other()), Succeeded());
    EXPECT_EQ(kData, ReadFile(share_.other()));
    EXPECT_EQ(kInfo, share_.Get(share_.other(), kFinderInfo));
    EXPECT_EQ(kForkValue, share_.Get(share_.other(), kFork));
    EXPECT_EQ("1", share_.Run({"get", share_.other(), kLocked}).out);
    struct stat info;
    ASSERT_EQ(0, stat(share_.other().c_str(), &info));
    EXPECT_EQ(0xB0000002 - std::int64_t{2082844800}, info.st_mtim.tv_sec);
    EXPECT_THAT(
        share_.Run({"export", share_.other(), share_.archive() + "2"}),
        Failed(2, share_.other() + ": not all of its metadata arrived at " + share_.archive() +
                      "2: locked state (AppleDouble has no place for it); see what "
                      "it is with: mavoea list -l PATH"));
    const auto entries = EntriesOf(ReadFile(share_.archive() + "2"));
    EXPECT_EQ(kComment, entries.at(kCommentEntry));
    EXPECT_EQ(kDates, entries.at(kDatesEntry));
}

TEST_P(ExportTest, BinHexAndAppleSingleAreReadWhole) {
    for (const Bytes& bytes : {kBinHex, kAppleSingle}) {
        EXPECT_THAT(share_.Import(bytes, share_.other()), Succeeded());
        EXPECT_EQ(kData, ReadFile(share_.other()));
        EXPECT_EQ(kTypeOnly, share_.Get(share_.other(), kFinderInfo));
        EXPECT_EQ(kForkValue, share_.Get(share_.other(), kFork));
        EXPECT_EQ(kFinderInfo + '\n' + kFork + '\n', share_.Run({"list", share_.other()}).out);
        ASSERT_THAT(share_.Run({"rm", share_.other()}), Succeeded());
    }
}

// ---- There and back -----------------------------------------------------------------------------

TEST_P(ExportTest, WhatTheFormatHoldsComesBackAsItWas) {
    share_.Set(kFinderInfo, kTypeOnly);
    share_.Set(kFork, Bytes(300000, 0x90));
    for (const char* format : kFormatsWithData) {
        SCOPED_TRACE(format);
        Share back(GetParam());
        ASSERT_EQ(0, unlink(back.file().c_str()));
        EXPECT_THAT(share_.Export(format), Succeeded());
        EXPECT_THAT(back.Run({"import", share_.archive(), back.path()}), Succeeded());
        EXPECT_THAT(RunTool({"--volume", share_.path() + '=' + share_.type(), "--volume",
                             back.path() + '=' + back.type(), "diff", "--data", share_.file(),
                             back.file()}),
                    Succeeded());
        EXPECT_EQ(kData, ReadFile(back.file()));
    }
}

TEST_P(ExportTest, AppleSingleAndMacBinaryKeepCommentAndLock) {
    share_.Set(kFinderInfo, kInfo);
    share_.SetEntries({{kCommentEntry, kComment}, {kDatesEntry, kDates}});
    ASSERT_THAT(share_.Run({"lock", share_.file()}), Succeeded());
    for (const char* format : {"applesingle", "macbinary"}) {
        SCOPED_TRACE(format);
        Share back(GetParam());
        ASSERT_EQ(0, unlink(back.file().c_str()));
        EXPECT_THAT(share_.Export(format), Succeeded());
        EXPECT_THAT(back.Run({"import", share_.archive(), back.path()}), Succeeded());
        EXPECT_EQ("1", back.Run({"get", back.file(), kLocked}).out);
        EXPECT_THAT(RunTool({"--volume", share_.path() + '=' + share_.type(), "--volume",
                             back.path() + '=' + back.type(), "diff", "--data", share_.file(),
                             back.file()}),
                    Succeeded());
    }
}

TEST_P(ExportTest, AppleDoubleKeepsAttributes) {
    share_.Set(kColour, Ascii("blue"));
    share_.Set(kFinderInfo, kInfo);
    share_.Set(kFork, kForkValue);
    EXPECT_THAT(share_.Run({"export", share_.file(), share_.archive()}), Succeeded());
    EXPECT_EQ((MacContents{{{kColour, Ascii("blue")}}, kInfo, kForkValue}),
              ReadMacFile(ReadFile(share_.archive())));
    WriteFile(share_.other(), {});
    EXPECT_THAT(share_.Run({"import", share_.archive(), share_.other()}), Succeeded());
    EXPECT_EQ("blue", share_.Run({"get", share_.other(), kColour}).out);
}

TEST_P(ExportTest, WhatHasNoPlaceIsNamedAndTheRestIsWritten) {
    share_.Set(kColour, Ascii("blue"));
    Bytes info = kInfo;
    info[31] = 5;  // of no field that an archive has
    share_.Set(kFinderInfo, info);
    const std::string colour = "\"" + kColour + "\" (";
    EXPECT_THAT(share_.Export("applesingle"),
                Failed(2, NotAll(share_, colour + "AppleSingle has no place for it)")));
    EXPECT_THAT(
        share_.Export("macbinary"),
        Failed(2, NotAll(share_, colour + "MacBinary has no place for it), Finder info (MacBinary "
                                          "has no place for all of it)")));
    EXPECT_THAT(share_.Import(ReadFile(share_.archive()), share_.other()), Succeeded());
    EXPECT_EQ(kInfo, share_.Get(share_.other(), kFinderInfo));
    ASSERT_THAT(share_.Run({"rm", share_.other()}), Succeeded());
    ASSERT_THAT(share_.Run({"lock", share_.file()}), Succeeded());
    EXPECT_THAT(share_.Export("binhex"),
                Failed(2, NotAll(share_, "locked state (BinHex has no place for it), " + colour +
                                             "BinHex has no place for it), Finder info (BinHex has "
                                             "no place for all of it)")));
    EXPECT_THAT(share_.Import(ReadFile(share_.archive()), share_.other()), Succeeded());
    EXPECT_EQ(Hex("'TEXTttxt' 40 01 00*22"), share_.Get(share_.other(), kFinderInfo));
    const auto json =
        share_
            .Run({"--json", "export", "-f", "--format", "binhex", share_.file(), share_.archive()})
            .json();
    EXPECT_EQ("locked state", json["missing"][0]["name"]);
    EXPECT_EQ(3U, json["missing"].size());
}

TEST_P(ExportTest, DatesThatMacBinaryHasNoPlaceForAreNamed) {
    Bytes dates = kDates;
    dates[8] = 0;  // of a backup
    share_.SetEntries({{kDatesEntry, dates}});
    EXPECT_THAT(
        share_.Export("macbinary"),
        Failed(2, NotAll(share_, "dates of backup and access (MacBinary has no place for it)")));
    const Bytes head = ReadFile(share_.archive());
    EXPECT_EQ(Hex("B0 00 00 01 B0 00 00 02"), Bytes(&head[91], &head[91] + 8));
}

TEST_P(ExportTest, ObjectsWithoutMetadataHaveTheirData) {
    for (const char* format : kFormats) {
        SCOPED_TRACE(format);
        EXPECT_THAT(share_.Export(format), Succeeded());
        WriteFile(share_.other(), kData);
        EXPECT_THAT(share_.Run({"import", share_.archive(), share_.other()}), Succeeded());
        EXPECT_EQ("", share_.Run({"list", share_.other()}).out);
        EXPECT_EQ(std::vector<std::string>({"letter.txt", "other.txt"}), NamesIn(share_.path()));
    }
}

// ---- Files that are damaged ---------------------------------------------------------------------

TEST_P(ExportTest, EveryTruncationIsRefusedAndMakesNothing) {
    const std::pair<Bytes, std::size_t> files[] = {
        {kAppleSingle, kAppleSingle.size()},
        {kMacBinary, kMacBinary.size() - 119},  // behind it is padding
        {kBinHex, kBinHex.size() - 2}};
    const std::vector<std::string> before = NamesIn(share_.path());
    for (const auto& [bytes, needed] : files) {
        for (std::size_t size = 0; size < needed; size += (size < 200 ? 3 : 17) * SeriesStep()) {
            SCOPED_TRACE(size);
            const Bytes cut(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(size));
            const ToolResult result = share_.Import(cut, share_.other());
            EXPECT_EQ(2, result.status);
            EXPECT_EQ("", result.out);
            EXPECT_EQ(before, NamesIn(share_.path()));
        }
        const Bytes least(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(needed));
        EXPECT_THAT(share_.Import(least, share_.other()), Succeeded());
        ASSERT_THAT(share_.Run({"rm", "-f", share_.other()}), Succeeded());
    }
}

TEST_P(ExportTest, DamageIsNamedAndMakesNothing) {
    const std::vector<std::string> before = NamesIn(share_.path());
    const std::string again = "; get it once more from where it came from";
    const auto expect = [&](const Bytes& bytes, const std::string& what) {
        EXPECT_THAT(share_.Import(bytes, share_.other()),
                    Failed(2, share_.archive() + ": damaged: " + what + again));
        EXPECT_EQ(before, NamesIn(share_.path()));
    };
    expect(Hex("00 05 16 00 00 02 00 00 00*16 00 02 "
               "00 00 00 01 00 00 00 00 00 00 00 28 00 00 00 02 00 00 00 00 00 00 00 28"),
           "its entries share bytes");
    expect(Hex("00 05 16 00 00 02 00 00 00*16 00 41") + Repeat(0, 65 * 12),
           "it declares 65 entries");
    const auto damaged = [](std::size_t from_end) {
        Bytes bytes = kBinHex;
        std::uint8_t& digit = bytes[bytes.size() - from_end];
        digit = digit == '!' ? '"' : '!';
        return bytes;
    };
    expect(damaged(7), "its resource fork is not what its checksum says");
    expect(damaged(40), "its data fork is not what its checksum says");
    expect(damaged(80), "its head is not what its checksum says");
}

// ---- What is there already ----------------------------------------------------------------------

class ArchiveTest : public ::testing::Test {
 protected:
    Share share_{"0"};
};

TEST_F(ArchiveTest, OtherDataIsReplacedOnlyWhereThatIsAskedFor) {
    for (const Bytes& bytes : {kBinHex, kAppleSingle}) {
        WriteFile(share_.file(), Ascii("something else that is longer"));
        ASSERT_EQ(0, chmod(share_.file().c_str(), 0604));
        const std::string format = bytes == kBinHex ? "BinHex" : "AppleSingle";
        EXPECT_THAT(share_.Import(bytes, share_.file()),
                    Failed(2, share_.file() + ": its data is not that of the " + format +
                                  " file; replace it with: mavoea import --data, or name another "
                                  "path"));
        EXPECT_EQ(Ascii("something else that is longer"), ReadFile(share_.file()));
        EXPECT_EQ(std::vector<std::string>{"letter.txt"}, NamesIn(share_.path()));
        EXPECT_THAT(share_.Run({"import", "--data", share_.archive(), share_.file()}), Succeeded());
        EXPECT_EQ(kData, ReadFile(share_.file()));
        EXPECT_EQ(0604, ModeOf(share_.file()));
        EXPECT_EQ(kForkValue, share_.Get(share_.file(), kFork));
        ASSERT_EQ(0, unlink((share_.path() + "/._letter.txt").c_str()));
    }
}

TEST_F(ArchiveTest, EqualDataIsLeftAloneAndMetadataComesToIt) {
    share_.Set(kColour, Ascii("blue"));
    struct stat before;
    ASSERT_EQ(0, stat(share_.file().c_str(), &before));
    EXPECT_THAT(share_.Import(kBinHex, share_.file()), Succeeded());
    struct stat after;
    ASSERT_EQ(0, stat(share_.file().c_str(), &after));
    EXPECT_EQ(before.st_ino, after.st_ino);
    EXPECT_EQ(before.st_mtim.tv_nsec, after.st_mtim.tv_nsec);
    EXPECT_EQ(kForkValue, share_.Get(share_.file(), kFork));
    EXPECT_EQ("blue", share_.Run({"get", share_.file(), kColour}).out);
}

TEST_F(ArchiveTest, AFileOfSeveralNamesIsNotWrittenInto) {
    WriteFile(share_.other(), Ascii("of somebody else"));
    ASSERT_EQ(0, unlink(share_.file().c_str()));
    ASSERT_EQ(0, link(share_.other().c_str(), share_.file().c_str()));
    WriteFile(share_.archive(), kBinHex);
    EXPECT_THAT(share_.Run({"import", "--data", share_.archive(), share_.file()}),
                Failed(2, share_.file() +
                              ": it has several names, and its data is another; remove it first"));
    EXPECT_EQ(Ascii("of somebody else"), ReadFile(share_.other()));
}

TEST_F(ArchiveTest, ASymbolicLinkIsNotFollowed) {
    WriteFile(share_.other(), Ascii("of somebody else"));
    ASSERT_EQ(0, unlink(share_.file().c_str()));
    ASSERT_EQ(0, symlink(share_.other().c_str(), share_.file().c_str()));
    WriteFile(share_.archive(), kBinHex);
    for (const std::string& target : {share_.file(), share_.path()}) {
        const ToolResult result = share_.Run({"import", "--data", share_.archive(), target});
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, HasSubstr("a symbolic link in the place of a file"));
    }
    EXPECT_EQ(Ascii("of somebody else"), ReadFile(share_.other()));
    EXPECT_EQ(std::vector<std::string>({"letter.txt", "other.txt"}), NamesIn(share_.path()));
}

TEST_F(ArchiveTest, MetadataOfAnObjectThatHasGoneIsNotTakenForTheNewOnes) {
    WriteFile(share_.path() + "/._other.txt", ClassicFile(kInfo, {}).bytes);
    EXPECT_THAT(share_.Import(kBinHex, share_.other()),
                Failed(2, share_.other() + ": metadata of an object that has gone is in its place; "
                                           "see what it is with: mavoea clean DIR"));
    EXPECT_FALSE(Exists(share_.other()));
}

TEST_F(ArchiveTest, WhereNothingCanBeMadeOrReplacedThatIsTold) {
    WriteFile(share_.archive(), kAppleDouble);
    EXPECT_THAT(share_.Run({"import", share_.archive(), share_.other()}),
                Failed(1, share_.other() + ": No such file or directory; check the path"));
    EXPECT_THAT(share_.Run({"import", "--data", share_.archive(), share_.file()}),
                Failed(2, share_.archive() + ": it holds no data; leave --data out"));
    const Share nowhere("4");
    EXPECT_THAT(nowhere.Import(kBinHex, nowhere.other()).err,
                HasSubstr("volumes of type 4 keep no metadata"));
    EXPECT_EQ(std::vector<std::string>{"letter.txt"}, NamesIn(nowhere.path()));
}

// ---- Names --------------------------------------------------------------------------------------

// An AppleSingle file of that name, with data.
Bytes SingleNamed(const std::string& name) {
    const auto size = static_cast<std::uint8_t>(name.size());
    return Hex("00 05 16 00 00 02 00 00 00*16 00 02 00 00 00 03 00 00 00 34 00 00") +
           Bytes{static_cast<std::uint8_t>(name.size() >> 8), size} +
           Hex("00 00 00 01 00 00 00 32 00 00 00 02 'xy'") + Ascii(name);
}

TEST_F(ArchiveTest, ANameLeadsNowhereElse) {
    ASSERT_EQ(0, mkdir((share_.path() + "/in").c_str(), 0755));
    const std::string into = share_.path() + "/in";
    const std::string none = "the name in it is none that a file could have";
    const std::string of_metadata = "the name in it is that of metadata";
    const std::pair<std::string, std::string> cases[] = {
        {"", "it holds no name"},
        {".", none},
        {"..", none},
        {"../x", none},
        {"/tmp/x", none},
        {std::string("a\0b", 3), none},
        {std::string(255, 'n') + 'n', "the name in it is too long"},
        {"._letter.txt", of_metadata},
        {"@eaDir", of_metadata},
        {".mavoea-abcdefgh", of_metadata}};
    for (const auto& [name, why] : cases) {
        EXPECT_THAT(share_.Import(SingleNamed(name), into),
                    Failed(2, share_.archive() + ": " + why +
                                  "; name the new file: mavoea import FILE DIR/NAME"));
    }
    EXPECT_EQ(std::vector<std::string>(), NamesIn(into));
    EXPECT_EQ(std::vector<std::string>({"in", "letter.txt"}), NamesIn(share_.path()));
    EXPECT_THAT(share_.Import(SingleNamed("..x"), into), Succeeded());
    EXPECT_EQ(Ascii("xy"), ReadFile(into + "/..x"));
}

TEST_F(ArchiveTest, NamesAreMacOsRoman) {
    const std::string name =
        "\xC3\x9C"
        "bung \xE2\x80\xA2";  // as UTF-8
    WriteFile(share_.path() + '/' + name, kData);
    ASSERT_EQ(0, mkdir((share_.path() + "/in").c_str(), 0755));
    for (const char* format : {"macbinary", "binhex"}) {
        unlink(share_.archive().c_str());
        EXPECT_THAT(share_.Run({"export", "--format", format, share_.path() + '/' + name,
                                share_.archive()}),
                    Succeeded());
        if (std::string("macbinary") == format) {
            const Bytes head = ReadFile(share_.archive());
            EXPECT_EQ(Hex("07 86 'bung ' A5 00"), Bytes(&head[1], &head[1] + 9));
        }
        EXPECT_THAT(share_.Run({"import", share_.archive(), share_.path() + "/in"}), Succeeded());
        EXPECT_EQ(std::vector<std::string>{name}, NamesIn(share_.path() + "/in"));
        ASSERT_EQ(0, unlink((share_.path() + "/in/" + name).c_str()));
    }
}

TEST_F(ArchiveTest, ANameThatHasNoPlaceIsNamed) {
    const std::pair<std::string, Bytes> cases[] = {
        {"\xD0\x96.txt", Hex("05 '_.txt' 00")},  // a letter of Russian
        {"\xFF.txt", Hex("05 '_.txt' 00")},
        {std::string(64, 'n'), Hex("3F") + Repeat('n', 63)}};
    for (const auto& [name, written] : cases) {
        const std::string path = share_.path() + '/' + name;
        WriteFile(path, kData);
        unlink(share_.archive().c_str());
        EXPECT_THAT(
            share_.Run({"export", "--format", "macbinary", path, share_.archive()}),
            Failed(2, path + ": not all of its metadata arrived at " + share_.archive() +
                          ": name (MacBinary has room for 63 letters of Mac OS Roman); see what it "
                          "is with: mavoea list -l PATH"));
        const Bytes head = ReadFile(share_.archive());
        EXPECT_EQ(written, Bytes(&head[1], &head[1] + written.size()));
    }
}

TEST_F(ArchiveTest, TimesInMacBinaryAreLocal) {
    ASSERT_EQ(0, setenv("TZ", "EST5", 1));
    const timespec times[2] = {{869945218, 0}, {869945218, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, share_.file().c_str(), times, 0));
    EXPECT_THAT(share_.Export("macbinary"), Succeeded());
    const Bytes head = ReadFile(share_.archive());
    // Five hours earlier on the clock than in Greenwich, where it would be B0000002.
    EXPECT_EQ(Hex("00*4 AF FF B9 B2"), Bytes(&head[91], &head[91] + 8));
    EXPECT_THAT(share_.Run({"import", share_.archive(), share_.other()}), Succeeded());
    struct stat info;
    ASSERT_EQ(0, stat(share_.other().c_str(), &info));
    EXPECT_EQ(869945218, info.st_mtim.tv_sec);
    ASSERT_EQ(0, unsetenv("TZ"));
}

// ---- The new file -------------------------------------------------------------------------------

TEST_F(ArchiveTest, AFileThatIsThereIsReplacedByForceOnly) {
    WriteFile(share_.archive(), Ascii("mine"));
    for (const char* format : kFormats) {
        EXPECT_THAT(share_.Run({"export", "--format", format, share_.file(), share_.archive()}),
                    Failed(2, share_.archive() + ": it is there already; replace it with: mavoea "
                                                 "export --force, or name another file"));
    }
    EXPECT_EQ(Ascii("mine"), ReadFile(share_.archive()));
    EXPECT_THAT(share_.Run({"export", "--force", share_.file(), share_.archive()}), Succeeded());
    EXPECT_TRUE(ReadMacFile(ReadFile(share_.archive())));
    EXPECT_EQ(std::vector<std::string>{"archive"}, share_.NamesOutside());
}

TEST_F(ArchiveTest, TheObjectAndItsMetadataAreNeverReplaced) {
    share_.Set(kFork, kForkValue);
    const std::string own = share_.path() + "/._letter.txt";
    const std::string second = share_.path() + "/second";
    ASSERT_EQ(0, link(share_.file().c_str(), second.c_str()));
    const Bytes before = ReadFile(own);
    for (const std::string& target : {share_.file(), second, own}) {
        EXPECT_THAT(share_.Run({"export", "-f", "--format", "binhex", share_.file(), target}),
                    Failed(2, target + ": it is the object's own; name another file"));
    }
    EXPECT_EQ(kData, ReadFile(share_.file()));
    EXPECT_EQ(before, ReadFile(own));
    EXPECT_EQ(2, share_.Run({"export", "-f", share_.file(), share_.path()}).status);
}

TEST_F(ArchiveTest, WhoMayNotReadTheObjectMayNotReadTheFile) {
    ASSERT_EQ(0, chmod(share_.file().c_str(), 0600));
    EXPECT_THAT(share_.Export("applesingle"), Succeeded());
    EXPECT_EQ(0600, ModeOf(share_.archive()));
}

TEST_F(ArchiveTest, StandardOutputTakesIt) {
    share_.Set(kFinderInfo, kTypeOnly);
    share_.Set(kFork, kForkValue);
    const ToolResult result = share_.Run({"export", "--format", "applesingle", share_.file(), "-"});
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(kAppleSingle, result.bytes());
    EXPECT_THAT(share_.Run({"--json", "export", share_.file(), "-"}),
                Failed(2,
                       "--json: standard output cannot have both the file and JSON; name a "
                       "file"));
}

TEST_F(ArchiveTest, ATerminalTakesTextOnly) {
    const int terminal = posix_openpt(O_RDWR | O_NOCTTY);
    if (terminal < 0 || grantpt(terminal) != 0 || unlockpt(terminal) != 0) {
        GTEST_SKIP() << "there are no terminals here";
    }
    const std::string shown = ptsname(terminal);
    const auto run = [&](const std::string& format) {
        const std::string command = Tested().Command() + " export --format " + format + ' ' +
                                    Quoted(share_.file()) + " - >" + shown + " 2>/dev/null";
        return WEXITSTATUS(std::system(command.c_str()));
    };
    EXPECT_EQ(2, run("macbinary"));
    EXPECT_EQ(2, run("appledouble"));
    EXPECT_EQ(0, run("binhex"));
    close(terminal);
}

TEST_F(ArchiveTest, WhatCannotBeExportedIsTold) {
    EXPECT_THAT(share_.Run({"export", "--format", "zip", share_.file(), share_.archive()}),
                Failed(2,
                       "zip: no format of that name; use appledouble, applesingle, macbinary or "
                       "binhex"));
    EXPECT_THAT(share_.Run({"export", "--format", "binhex", share_.path(), share_.archive()}),
                Failed(2, share_.path() + ": it has no data that BinHex could hold; use --format "
                                          "appledouble"));
    EXPECT_EQ(1, share_.Run({"export", share_.other(), share_.archive()}).status);
    WriteFile(share_.path() + "/._letter.txt", Hex("00 05 16 07 00 02 00 00 00*16 00 01 00 00 00 "
                                                   "02 00 00 00 26 00 00 00 50"));
    EXPECT_EQ(2, share_.Export("binhex").status);
    EXPECT_EQ(std::vector<std::string>(), share_.NamesOutside());
}

TEST_F(ArchiveTest, LargeForksAreNotHeldInMemory) {
    constexpr std::size_t kSize = std::size_t{96} << 20;
    constexpr Limits kLittle = {.memory = std::size_t{64} << 20};
    const int fd = open(share_.file().c_str(), O_WRONLY);
    ASSERT_EQ(0, ftruncate(fd, kSize));
    close(fd);
    for (const char* format : {"applesingle", "macbinary"}) {
        unlink(share_.archive().c_str());
        EXPECT_THAT(
            share_.Run({"export", "--format", format, share_.file(), share_.archive()}, kLittle),
            Succeeded());
        EXPECT_THAT(share_.Run({"import", share_.archive(), share_.other()}, kLittle), Succeeded());
        struct stat info;
        ASSERT_EQ(0, stat(share_.other().c_str(), &info));
        EXPECT_EQ(kSize, static_cast<std::size_t>(info.st_size));
        ASSERT_EQ(0, unlink(share_.other().c_str()));
    }
}

// ---- Files that Macs and other programs have written
// ---------------------------------------------

TEST_F(ArchiveTest, AnAppleSingleFileOfAMacIsUnpacked) {
    const std::string sample =
        std::string(MAVOEA_SHARED_DATA) + "/ciderpress2/applesingle_hello__.as.bin";
    if (!Exists(sample)) GTEST_SKIP() << kNoSampleFiles;
    ASSERT_EQ(0, mkdir((share_.path() + "/in").c_str(), 0755));
    EXPECT_THAT(share_.Run({"import", sample, share_.path() + "/in"}), Succeeded());
    const std::string name = "hello\xE2\x80\xA2\xE2\x86\x97";
    EXPECT_EQ(std::vector<std::string>({"._" + name, name}), NamesIn(share_.path() + "/in"));
    EXPECT_EQ(Ascii("Hello, world!\n"), ReadFile(share_.path() + "/in/" + name));
}

}  // namespace
}  // namespace mavoea::test

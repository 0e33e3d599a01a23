// Two trees side by side, on volumes of any kinds: what of their objects is not the same.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <csignal>
#include <sstream>

#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"
#include "tests/tool/volumes.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";

std::vector<std::string> LinesOf(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

// A tree on an EA-directory volume and its copy on an AppleDouble volume, which are the same.
class DiffTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volumes_.path());
        first_ = volumes_.Make("first", 1);
        second_ = volumes_.Declare("second", 0);
        MakeDir(first_ + "/folder");
        WriteFile(first_ + "/file", Pattern(1100000));
        volumes_.Set(first_ + "/file", "colour", Ascii("blue"));
        volumes_.Set(first_ + "/file", "shape", Ascii("round"));
        volumes_.Set(first_ + "/file", kFinderInfo, Pattern(32, 0x40));
        volumes_.Set(first_ + "/file", kFork, Pattern(100));
        WriteFile(first_ + "/folder/plain", Ascii("data"));
        ASSERT_EQ(0, symlink("file", (first_ + "/link").c_str()));
        ASSERT_THAT(volumes_.Convert(first_, second_, "appledouble"), Succeeded());
        ASSERT_THAT(Diff(), Succeeded());
        ASSERT_EQ("", Diff().out);
    }

    ToolResult Diff(Arguments options = {"-r", "--data"}) const {
        options.insert(options.begin(), "diff");
        options.insert(options.end(), {first_, second_});
        return volumes_.Run(options);
    }

    // That these lines are said, and nothing else; and that nothing changes.
    void ExpectLines(const std::vector<std::string>& lines,
                     const Arguments& options = {"-r", "--data"}) const {
        const auto before = std::pair(Contents(first_), Contents(second_));
        const ToolResult result = Diff(options);
        EXPECT_EQ(1, result.status);
        EXPECT_EQ("", result.err);
        EXPECT_EQ(lines, LinesOf(result.out));
        EXPECT_EQ(before, std::pair(Contents(first_), Contents(second_)));
    }

    // That this of the file is found.
    void ExpectFound(const std::string& what) const {
        ExpectLines({"Files " + first_ + "/file and " + second_ + "/file differ: " + what});
    }

    void Change(const std::string& name, const Bytes& value) const {
        volumes_.Set(second_ + "/file", name, value);
    }

    Volumes volumes_;
    std::string first_;
    std::string second_;
};

// ---- What is found ------------------------------------------------------------------------------

TEST_F(DiffTest, AByteOfTheDataIsFoundWhereverItIs) {
    for (const std::size_t at : {0U, 1048575U, 1048576U, 1099999U}) {
        Bytes data = Pattern(1100000);
        data[at] ^= 1;
        WriteFile(second_ + "/file", data);
        ExpectFound("data at byte " + std::to_string(at));
    }
}

TEST_F(DiffTest, DataOfAnotherLengthIsFound) {
    Bytes data = Pattern(1100000);
    data.pop_back();
    WriteFile(second_ + "/file", data);
    ExpectFound("data at byte 1099999");
    WriteFile(second_ + "/file", Pattern(1100000) + Ascii("x"));
    ExpectFound("data at byte 1100000");
    WriteFile(second_ + "/file", {});
    ExpectFound("data at byte 0");
}

TEST_F(DiffTest, DataIsLookedAtOnlyWhenThatIsAsked) {
    WriteFile(second_ + "/file", Ascii("other data"));
    const ToolResult result = Diff({"-r"});
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ("", result.out);
}

TEST_F(DiffTest, AValueThatDiffersIsFoundByItsName) {
    Change("colour", Ascii("blUe"));
    ExpectFound("\"colour\" at byte 2");
}

TEST_F(DiffTest, AValueThatGoesOnIsFound) {
    Change("colour", Ascii("blueish"));
    ExpectFound("\"colour\" at byte 4");
}

TEST_F(DiffTest, AnAttributeOnOneSideIsFound) {
    ASSERT_THAT(volumes_.Run({"remove", second_ + "/file", "colour"}), Succeeded());
    ExpectFound("\"colour\" only in the first");
    ASSERT_THAT(volumes_.Run({"remove", first_ + "/file", "colour"}), Succeeded());
    Change("two\nlines", {});
    ExpectFound("\"two\\x0Alines\" only in the second");
}

TEST_F(DiffTest, AByteOfTheFinderInfoIsFound) {
    Bytes info = Pattern(32, 0x40);
    info[31] ^= 0x80;
    Change(kFinderInfo, info);
    ExpectFound("\"com.apple.FinderInfo\" at byte 31");
    Change(kFinderInfo, Bytes(32));
    ExpectFound("\"com.apple.FinderInfo\" only in the first");
}

TEST_F(DiffTest, AByteOfTheResourceForkIsFound) {
    Bytes fork = Pattern(100);
    fork[50] ^= 1;
    Change(kFork, fork);
    ExpectFound("\"com.apple.ResourceFork\" at byte 50");
    Change(kFork, {});
    ExpectFound("\"com.apple.ResourceFork\" only in the first");
}

TEST_F(DiffTest, TheLockIsFoundBothWays) {
    ASSERT_THAT(volumes_.Run({"lock", second_ + "/file"}), Succeeded());
    ExpectFound("\"mavoea.locked\" only in the second");
    ASSERT_THAT(volumes_.Run({"unlock", second_ + "/file"}), Succeeded());
    ASSERT_THAT(volumes_.Run({"lock", first_ + "/file"}), Succeeded());
    ExpectFound("\"mavoea.locked\" only in the first");
}

TEST_F(DiffTest, AllThatDiffersOfAnObjectStandsOnOneLine) {
    WriteFile(second_ + "/file", {});
    Change("colour", Ascii("red"));
    Change(kFork, Ascii("fork"));
    ExpectFound("data at byte 0, \"colour\" at byte 0, \"com.apple.ResourceFork\" at byte 0");
    ExpectLines({"Files " + first_ + "/file and " + second_ + "/file differ"}, {"-r", "--brief"});
}

TEST_F(DiffTest, AnObjectOnOneSideIsFound) {
    WriteFile(second_ + "/folder/another", {});
    ASSERT_EQ(0, unlink((second_ + "/folder/plain").c_str()));
    ExpectLines(
        {"Only in " + second_ + "/folder: another", "Only in " + first_ + "/folder: plain"});
}

TEST_F(DiffTest, AnObjectOfAnotherTypeIsFound) {
    ASSERT_EQ(0, unlink((second_ + "/folder/plain").c_str()));
    MakeDir(second_ + "/folder/plain");
    ExpectLines({"File " + first_ + "/folder/plain is a regular file while file " + second_ +
                 "/folder/plain is a directory"});
}

TEST_F(DiffTest, ALinkThatLeadsElsewhereIsFound) {
    ASSERT_EQ(0, unlink((second_ + "/link").c_str()));
    ASSERT_EQ(0, symlink("filter", (second_ + "/link").c_str()));
    ExpectLines({"Files " + first_ + "/link and " + second_ + "/link differ: target at byte 3"});
}

TEST_F(DiffTest, WithoutRecursionOnlyTheObjectsThemselvesAreCompared) {
    ASSERT_EQ(0, unlink((second_ + "/folder/plain").c_str()));
    EXPECT_EQ("", Diff({}).out);
    EXPECT_THAT(Diff({}), Succeeded());
}

// An attribute of the object itself is metadata on volumes of type 7 only, and there on either
// side.
TEST_F(DiffTest, WhatEveryFileMayHaveIsNoDifferenceWhicheverComesFirst) {
    const std::string other = volumes_.Make("other", 7);
    for (const std::string& directory : {first_, other}) {
        WriteFile(directory + "/own", {});
        ASSERT_EQ(0, setxattr((directory + "/own").c_str(), "user.own", "x", 1, 0));
    }
    EXPECT_EQ("", volumes_.Run({"diff", first_ + "/own", other + "/own"}).out);
    EXPECT_EQ("", volumes_.Run({"diff", other + "/own", first_ + "/own"}).out);
    ASSERT_EQ(0, setxattr((first_ + "/own").c_str(), "user.own", "y", 1, 0));
    EXPECT_THAT(volumes_.Run({"diff", first_ + "/own", other + "/own"}).out,
                HasSubstr("\"user.own\" only in the second"));
    EXPECT_THAT(volumes_.Run({"diff", other + "/own", first_ + "/own"}).out,
                HasSubstr("\"user.own\" only in the first"));
}

// ---- How it is said -----------------------------------------------------------------------------

TEST_F(DiffTest, ChangesAreItemizedAsForTheSecondToBecomeLikeTheFirst) {
    WriteFile(first_ + "/new", {});
    MakeDir(second_ + "/old");
    WriteFile(second_ + "/file", Ascii("other data"));
    Change("colour", Ascii("red"));
    Change(kFinderInfo, Pattern(32, 0x20));
    Change(kFork, Ascii("fork"));
    ASSERT_THAT(volumes_.Run({"lock", second_ + "/file"}), Succeeded());
    ASSERT_EQ(0, unlink((second_ + "/link").c_str()));
    ASSERT_EQ(0, symlink("elsewhere", (second_ + "/link").c_str()));
    volumes_.Set(first_ + "/folder", "colour", Ascii("green"));
    ExpectLines({">fdafr.m. file", ".d.a..... folder/", "cL....... link", ">f+++++++ new",
                 "*deleting old/"},
                {"-r", "--data", "-i"});
}

TEST_F(DiffTest, PathsAreShownAsTyped) {
    WriteFile(first_ + "/new", {});
    const std::string typed = volumes_.path() + "//./first";
    EXPECT_EQ("Only in " + typed + ": new\n",
              volumes_.Run({"diff", "-r", typed + '/', second_}).out);
}

TEST_F(DiffTest, JsonHasAnObjectOnEachLine) {
    WriteFile(first_ + "/new", {});
    WriteFile(second_ + "/file", Ascii("data"));
    Change(
        "sh\xFF"
        "ape",
        Ascii("x"));
    const ToolResult all = Diff({"--json", "-r", "--data"});
    EXPECT_EQ(1, all.status);
    const std::vector<std::string> lines = LinesOf(all.out);
    ASSERT_EQ(3U, lines.size());
    EXPECT_EQ(nlohmann::json::parse(R"({"first": ")" + first_ + R"(/file", "second": ")" + second_ +
                                    R"(/file", "differences": [
                    {"aspect": "data", "what": "different", "offset": 0},
                    {"aspect": "attribute", "name": "sh\uFFFDape", "nameHex": "7368ff617065",
                     "what": "extra"}]})"),
              nlohmann::json::parse(lines[0]));
    EXPECT_EQ(nlohmann::json::parse(R"({"first": ")" + first_ + R"(/new", "differences": [
                    {"aspect": "object", "what": "missing"}]})"),
              nlohmann::json::parse(lines[1]));
    EXPECT_EQ(nlohmann::json::parse(
                  R"({"compared": 5, "different": 2, "failed": 0, "interrupted": false})"),
              nlohmann::json::parse(lines[2]));
}

// ---- Trouble ------------------------------------------------------------------------------------

TEST_F(DiffTest, WhatCannotBeReadIsTroubleAndTheRestIsCompared) {
    WriteFile(first_ + "/@eaDir/file@MavoEAStream", Hex("00 05 16 07  00 02"));
    Bytes data = Pattern(1100000);
    data[7] ^= 1;
    WriteFile(second_ + "/file", data);
    const ToolResult result = Diff();
    EXPECT_EQ(2, result.status);
    EXPECT_EQ("Files " + first_ + "/file and " + second_ + "/file differ: data at byte 7\n",
              result.out);
    EXPECT_THAT(result.err, HasSubstr("mavoea: " + first_ + "/@eaDir/file@MavoEAStream: "));
    const std::vector<std::string> lines = LinesOf(Diff({"--json"}).out);
    EXPECT_THAT(lines, ElementsAre(HasSubstr("\"failed\":0")));
    EXPECT_THAT(LinesOf(Diff({"--json", "-r"}).out),
                ElementsAre(HasSubstr("@MavoEAStream: "), HasSubstr("\"failed\":1")));
}

TEST_F(DiffTest, WhatIsNotThereIsTroubleAndNoDifference) {
    const std::string nowhere = volumes_.path() + "/nowhere";
    const std::string message = nowhere + ": No such file or directory; check the path";
    EXPECT_THAT(volumes_.Run({"diff", first_, nowhere}), Failed(2, message));
    EXPECT_THAT(volumes_.Run({"diff", nowhere, second_}), Failed(2, message));
}

}  // namespace
}  // namespace mavoea::test

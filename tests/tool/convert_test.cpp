// Trees from one kind of volume to another through the tool.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <tuple>
#include <vector>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"
#include "tests/tool/volumes.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";

const char* NameOf(int type) {
    switch (type) {
        case 0:
            return "appledouble";
        case 1:
            return "eadir";
        case 2:
            return "fileea";
        default:
            return "xattr";
    }
}

// ---- Every pair ---------------------------------------------------------------------------------

class ConvertPairTest : public ::testing::TestWithParam<std::tuple<int, int>> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volumes_.path());
    }

    int from() const { return std::get<0>(GetParam()); }
    int to() const { return std::get<1>(GetParam()); }

    // The file systems at hand keep no Finder info and no fork as attributes.
    bool HasMacAttributes() const { return from() != 7 && to() != 7; }

    struct Value {
        std::string path;
        std::string name;
        Bytes value;
    };
    std::vector<Value> Values() const {
        std::vector<Value> values = {
            {"letter.txt", "user.colour", Ascii("blue")},
            {"letter.txt", "user.empty", {}},
            {"letter.txt", "user.large", Pattern(3000)},
            {"folder", "user.colour", Ascii("red")},
            {"folder/it's \"quoted\"\n\xC3\xA4", "user.colour", Ascii("green")},
            {"folder/deep/inner", "user.name\xC3\xA4", Pattern(10, 7)},
        };
        if (HasMacAttributes()) {
            values.insert(values.end(), {{"letter.txt", kFinderInfo, Pattern(32, 0x40)},
                                         {"letter.txt", kFork, Pattern(70000, 3)},
                                         {"folder", kFinderInfo, Pattern(32, 0x50)},
                                         {"folder/fork only", kFork, Pattern(100, 5)},
                                         {"folder/info only", kFinderInfo, Pattern(32, 0x60)}});
        }
        return values;
    }

    void MakeTree(const std::string& top) {
        for (const char* name : {"folder", "folder/deep"}) MakeDir(top + '/' + name);
        WriteFile(top + "/plain", Pattern(200000));
        WriteFile(top + "/locked", Ascii("locked"));
        for (const auto& [path, name, value] : Values()) {
            if (path != "folder") WriteFile(top + '/' + path, Ascii(path));
            chmod((top + '/' + path).c_str(), path == "folder" ? 0755 : 0644);
        }
        for (const auto& [path, name, value] : Values())
            volumes_.Set(top + '/' + path, name, value);
        ASSERT_THAT(volumes_.Run({"lock", top + "/locked"}), Succeeded());
        ASSERT_EQ(0, symlink("letter.txt", (top + "/link").c_str()));
        ASSERT_EQ(0, mkfifo((top + "/pipe").c_str(), 0644));
    }

    void CheckTree(const std::string& top) {
        for (const auto& [path, name, value] : Values()) {
            const ToolResult result = volumes_.Run({"get", top + '/' + path, name});
            EXPECT_THAT(result, Succeeded()) << path << ' ' << name;
            EXPECT_EQ(value, result.bytes()) << path << ' ' << name;
            if (path == "folder") continue;
            EXPECT_EQ(Ascii(path), ReadFile(top + '/' + path));
        }
        EXPECT_EQ(Pattern(200000), ReadFile(top + "/plain"));
        EXPECT_EQ("1", volumes_.Run({"get", top + "/locked", "mavoea.locked"}).out);
        EXPECT_EQ("0", volumes_.Run({"get", top + "/plain", "mavoea.locked"}).out);
        EXPECT_EQ("letter.txt", std::filesystem::read_symlink(top + "/link"));
        EXPECT_TRUE(std::filesystem::is_fifo(top + "/pipe"));
    }

    // Attribute volumes need a file system that takes every name, the Finder info's in any case;
    // and of an object with neither Finder info nor fork, nothing makes an AppleDouble file.
    static bool MayLose(int from, int to) {
        return (to == 7 && (from == 0 || from == 2)) || (from == 7 && to == 0);
    }

    // That everything which is not at the destination is on the list.
    void ExpectTold(const std::string& source, const std::string& there, const ToolResult& result) {
        EXPECT_EQ(2, result.status);
        EXPECT_NE("", result.err);
        for (const auto& [path, name, value] : Values()) {
            const ToolResult found = volumes_.Run({"get", there + '/' + path, name});
            if (found.status == 0 && found.bytes() == value) continue;
            const std::string odd = "\n\xC3\xA4";
            std::string shown = source + '/' + path;
            if (const auto at = shown.find(odd); at != std::string::npos) {
                shown.replace(at, 1, "\\x0A");
            }
            EXPECT_THAT(result.out, HasSubstr(shown + ": \"" + name + "\": "));
        }
    }

    Volumes volumes_;
};

std::vector<std::tuple<int, int>> AllPairs() {
    std::vector<std::tuple<int, int>> pairs;
    for (const int from : {0, 1, 2, 7}) {
        for (const int to : {0, 1, 2, 7}) pairs.emplace_back(from, to);
    }
    return pairs;
}

INSTANTIATE_TEST_SUITE_P(Types, ConvertPairTest, ::testing::ValuesIn(Thinned(AllPairs())),
                         [](const auto& tested) {
                             return "From" + std::to_string(std::get<0>(tested.param)) + "To" +
                                    std::to_string(std::get<1>(tested.param));
                         });

TEST_P(ConvertPairTest, ATreeGoesThereAndBackAndIsTheSame) {
    const std::string source = volumes_.Make("source", from());
    MakeTree(source);
    const auto before = Contents(source);
    const std::string all = HasMacAttributes() ? "12" : "10";

    const std::string there = volumes_.path() + "/there";
    const ToolResult forth = volumes_.Convert(source, there, NameOf(to()));
    volumes_.Declare("there", to());
    EXPECT_EQ(before, Contents(source));
    if (MayLose(from(), to()) && forth.status != 0) return ExpectTold(source, there, forth);
    EXPECT_THAT(forth, Succeeded());
    EXPECT_EQ(all + " converted, " + all + " compared, 0 differences, 0 failed\n", forth.out);
    CheckTree(there);

    const std::string back = volumes_.path() + "/back";
    const ToolResult result = volumes_.Convert(there, back, std::to_string(from()));
    volumes_.Declare("back", from());
    if (MayLose(to(), from()) && result.status != 0) return ExpectTold(there, back, result);
    EXPECT_THAT(result, Succeeded());
    CheckTree(back);
    const ToolResult same = volumes_.Run({"diff", "-r", "--data", source, back});
    EXPECT_THAT(same, Succeeded());
    EXPECT_EQ("", same.out);
}

TEST_P(ConvertPairTest, WhatIsAtTheDestinationIsReplaced) {
    const std::string source = volumes_.Make("source", from());
    WriteFile(source + "/file", Ascii("new"));
    volumes_.Set(source + "/file", "user.colour", Ascii("blue"));
    const std::string there = volumes_.Make("there", to());
    WriteFile(there + "/file", Ascii("older and longer"));
    volumes_.Set(there + "/file", "user.colour", Ascii("red as it was"));
    volumes_.Set(there + "/file", "user.shape", Ascii("round"));
    const ToolResult result = volumes_.Convert(source, there, NameOf(to()));
    EXPECT_EQ(Ascii("new"), ReadFile(there + "/file"));
    EXPECT_EQ(1, volumes_.Run({"get", there + "/file", "user.shape"}).status);
    if (MayLose(from(), to()) && result.status != 0) return;
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ("blue", volumes_.Run({"get", there + "/file", "user.colour"}).out);
}

// ---- What copies lose, and what only looks like it ----------------------------------------------

class ConvertTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volumes_.path());
    }

    std::string there() const { return volumes_.path() + "/there"; }

    Volumes volumes_;
};

class RecordConvertTest : public ConvertTest {
 protected:
    void SetUp() override {
        ConvertTest::SetUp();
        if (IsSkipped()) return;
        source_ = volumes_.Make("source", 2);
        WriteFile(source_ + "/file", Ascii("data"));
    }

    // Finder info, a comment, dates, and an AFP word that does not lock.
    static Bytes Record() {
        Bytes record = AttributeRecord();
        constexpr std::size_t kCommentLengthAt = 46;
        constexpr std::size_t kCommentAt = 154;
        constexpr std::size_t kAfpAttributesAt = 372;
        PutU32(record, kCommentLengthAt, 7);
        const Bytes comment = Ascii("comment");
        std::copy(comment.begin(), comment.end(), record.begin() + kCommentAt);
        PutU16(record, kAfpAttributesAt, 0x0040);
        return record;
    }

    void Store(const Bytes& record) const {
        ASSERT_EQ(0, setxattr((source_ + "/file").c_str(), "user.netatalk.Metadata", record.data(),
                              record.size(), 0));
    }

    // That all three are told to be missing, and why; nothing else is, and the data is there.
    void ExpectToldMissing(const char* type, const std::string& why) const {
        const ToolResult result = volumes_.Convert(source_, there() + type, type);
        EXPECT_EQ(2, result.status);
        EXPECT_EQ(source_ + "/file: AppleDouble AFP file info: missing\n" + source_ +
                      "/file: AppleDouble comment: missing\n" + source_ +
                      "/file: AppleDouble file dates: missing\n"
                      "1 converted, 2 compared, 3 differences, 1 failed\n",
                  result.out);
        EXPECT_EQ("mavoea: " + source_ + "/file: not all of its metadata arrived at " + there() +
                      type + "/file: comment (" + why + "), file dates (" + why +
                      "), AFP file info (" + why +
                      "); keep the original, or take the rest along by hand\n",
                  result.err);
        EXPECT_EQ(Ascii("data"), ReadFile(there() + type + "/file"));
    }

    std::string source_;
};

TEST_F(RecordConvertTest, WhatARecordHasArrivesWhereverThereIsAPlaceForIt) {
    Store(Record());
    const struct {
        const char* type;
        std::string file;
    } cases[] = {{"0", "/._file"}, {"1", "/@eaDir/file@MavoResource"}};
    for (const auto& [type, file] : cases) {
        SCOPED_TRACE(type);
        const ToolResult result = volumes_.Convert(source_, there() + type, type);
        EXPECT_THAT(result, Succeeded());
        EXPECT_EQ("2 converted, 2 compared, 0 differences, 0 failed\n", result.out);
        const Bytes bytes = ReadFile(there() + type + file);
        EXPECT_EQ((std::map<std::uint32_t, Bytes>{{4, Ascii("comment")},
                                                  {8, Repeat(0x11, 16)},
                                                  {11, Bytes(8)},
                                                  {14, Hex("00 00 00 40")},
                                                  {15, Bytes(4)}}),
                  EntriesOf(bytes));
        EXPECT_EQ((MacContents{{}, Pattern(32, 0x40), {}}), ReadMacFile(bytes));
    }
    EXPECT_THAT(volumes_.Convert(source_, there() + "2", "2"), Succeeded());
    Bytes record(1000);
    const ssize_t size = getxattr((there() + "2/file").c_str(), "user.netatalk.Metadata",
                                  record.data(), record.size());
    ASSERT_LT(0, size);
    record.resize(static_cast<std::size_t>(size));
    EXPECT_EQ(Record(), record);
}

TEST_F(RecordConvertTest, WhatHasNoPlaceIsToldToBeMissing) {
    Bytes record = Record();
    constexpr std::size_t kFinderInfoAt = 122;
    std::fill_n(record.begin() + kFinderInfoAt, 32, std::uint8_t{0});
    Store(record);
    ExpectToldMissing("7", "a volume of extended attributes has no place for it");
    volumes_.Set(source_ + "/file", "user.colour", Ascii("blue"));
    ExpectToldMissing("0", "a \"._\" file with attributes has no place for it");
    volumes_.Declare("there0", 0);
    EXPECT_EQ("blue", volumes_.Run({"get", there() + "0/file", "user.colour"}).out);
}

TEST_F(ConvertTest, ARecordThatOnlyLocksLosesNothing) {
    const std::string source = volumes_.Make("source", 2);
    WriteFile(source + "/file", {});
    ASSERT_THAT(volumes_.Run({"set", source + "/file", kFinderInfo, "--hex", std::string(64, '1')}),
                Succeeded());
    ASSERT_THAT(volumes_.Run({"lock", source + "/file"}), Succeeded());
    for (const char* type : {"0", "1", "2"}) {
        EXPECT_THAT(volumes_.Convert(source, there() + type, type), Succeeded()) << type;
    }
}

TEST_F(ConvertTest, AForkThatStandsForNoneIsNotMissed) {
    const std::string source = volumes_.Make("source", 1);
    WriteFile(source + "/file", {});
    Bytes fork = Hex("00 00 01 00  00 00 01 00  00 00 00 00  00 00 00 1E") +
                 Ascii("This resource fork intentionally left blank   ");
    fork.resize(286);
    MakeDir(source + "/@eaDir");
    WriteFile(source + "/@eaDir/file@MavoResource", PlainAppleDouble(Pattern(32, 0x40), fork));
    EXPECT_THAT(volumes_.Convert(source, there(), "0"), Succeeded());
    volumes_.Declare("there", 0);
    EXPECT_EQ(kFinderInfo + "\n", volumes_.Run({"list", there() + "/file"}).out);
}

TEST_F(ConvertTest, FilesThatKeepAttributesOfTheirOwnGetNoExtraOnes) {
    const std::string source = volumes_.Make("source", 1);
    WriteFile(source + "/file", {});
    ASSERT_EQ(0, setxattr((source + "/file").c_str(), "user.own", "x", 1, 0));
    EXPECT_THAT(volumes_.Convert(source, there(), "7"), Succeeded());
    ASSERT_EQ(0, setxattr((there() + "/file").c_str(), "user.own", "y", 1, 0));
    volumes_.Declare("there", 7);
    EXPECT_EQ("Files " + source + "/file and " + there() +
                  "/file differ: \"user.own\" only in the second\n",
              volumes_.Run({"diff", "-r", source, there()}).out);
}

TEST_F(ConvertTest, AVolumeThatIsOnlyCopiedToIsComparedByItsEaDirectory) {
    const std::string source = volumes_.Make("source", 1);
    WriteFile(source + "/file", {});
    volumes_.Set(source + "/file", "colour", Ascii("blue"));
    EXPECT_THAT(volumes_.Convert(source, there(), "12"), Succeeded());
    EXPECT_TRUE(Exists(there() + "/@eaDir/file@MavoEAStream"));
    ASSERT_EQ(0, unlink((there() + "/@eaDir/file@MavoEAStream").c_str()));
    volumes_.Declare("there", 12);
    EXPECT_EQ(
        "Files " + source + "/file and " + there() + "/file differ: \"colour\" only in the first\n",
        volumes_.Run({"diff", "-r", source, there()}).out);
}

TEST_F(ConvertTest, WhatTheFileSystemDoesNotTakeIsAFailureAndADifference) {
    const std::string source = volumes_.Make("source", 1);
    if (setxattr(source.c_str(), kFinderInfo.c_str(), "x", 1, 0) == 0) {
        GTEST_SKIP() << "this file system takes attributes of every name";
    }
    WriteFile(source + "/file", Ascii("data"));
    volumes_.Set(source + "/file", kFinderInfo, Pattern(32, 0x40));
    volumes_.Set(source + "/file", "user.colour", Ascii("blue"));
    const ToolResult result = volumes_.Convert(source, there(), "xattr");
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("mavoea: " + source + "/file: "));
    EXPECT_EQ(source +
                  "/file: \"com.apple.FinderInfo\": missing\n"
                  "1 converted, 2 compared, 1 difference, 1 failed\n",
              result.out);
    EXPECT_EQ(Ascii("data"), ReadFile(there() + "/file"));
}

// ---- Odd things in a tree -----------------------------------------------------------------------

TEST_F(ConvertTest, WithoutRecursionOneObjectIsCarried) {
    const std::string source = volumes_.Make("source", 1);
    MakeDir(source + "/folder");
    WriteFile(source + "/folder/file", Ascii("data"));
    volumes_.Set(source + "/folder", "colour", Ascii("red"));
    volumes_.Set(source + "/folder/file", "colour", Ascii("blue"));

    const ToolResult file = volumes_.Convert(source + "/folder/file", there(), "0", {});
    EXPECT_THAT(file, Succeeded());
    EXPECT_EQ("1 converted, 1 compared, 0 differences, 0 failed\n", file.out);
    EXPECT_TRUE(Exists(volumes_.path() + "/._there"));

    const std::string folder = volumes_.path() + "/folder";
    EXPECT_THAT(volumes_.Convert(source + "/folder", folder, "0", {}), Succeeded());
    EXPECT_TRUE(NamesIn(folder).empty());
    volumes_.Declare("folder", 0);
    EXPECT_EQ("red", volumes_.Run({"get", folder, "colour"}).out);
}

TEST_F(ConvertTest, WhatFailsInATreeDoesNotKeepTheRestFromIt) {
    const std::string source = volumes_.Make("source", 1);
    const std::string long_name(254, 'n');
    for (const std::string& name : {std::string("a"), std::string("bad"), long_name,
                                    std::string(254, 'p'), std::string("z")}) {
        WriteFile(source + '/' + name, Ascii("data"));
    }
    volumes_.Set(source + "/a", "colour", Ascii("blue"));
    volumes_.Set(source + "/z", "colour", Ascii("green"));
    volumes_.Set(source + '/' + long_name, "colour", Ascii("red"));
    WriteFile(source + "/@eaDir/bad@MavoEAStream", Hex("00 05 16 07  00 02"));

    const ToolResult result = volumes_.Convert(source, there(), "appledouble");
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("mavoea: " + source + "/bad: "));
    EXPECT_THAT(result.err,
                HasSubstr("mavoea: " + source + '/' + long_name +
                          ": not all of its metadata arrived at " + there() + '/' + long_name +
                          ": \"colour\" (its name is too long for a \"._\" file); keep "
                          "the original, or take the rest along by hand\n"));
    EXPECT_EQ(source + '/' + long_name +
                  ": \"colour\": missing\n"
                  "4 converted, 6 compared, 1 difference, 3 failed\n",
              result.out);
    EXPECT_EQ(Ascii("data"), ReadFile(there() + '/' + long_name));
    EXPECT_EQ(Ascii("data"), ReadFile(there() + "/bad"));
    volumes_.Declare("there", 0);
    EXPECT_EQ("blue", volumes_.Run({"get", there() + "/a", "colour"}).out);
    EXPECT_EQ("green", volumes_.Run({"get", there() + "/z", "colour"}).out);
    EXPECT_EQ(Ascii("data"), ReadFile(there() + '/' + std::string(254, 'p')));
}

TEST_F(ConvertTest, ADirectoryThatCannotBeMadeLeavesOutWhatIsBelowItOnly) {
    const std::string source = volumes_.Make("source", 1);
    MakeDir(source + "/folder");
    WriteFile(source + "/folder/file", {});
    WriteFile(source + "/other", {});
    MakeDir(there());
    WriteFile(there() + "/folder", Ascii("in the way"));
    const ToolResult result = volumes_.Convert(source, there(), "0");
    EXPECT_EQ(2, result.status);
    EXPECT_EQ("mavoea: " + there() + "/folder: Not a directory; check the path\n", result.err);
    EXPECT_EQ(source +
                  "/folder: type: different\n"
                  "2 converted, 3 compared, 1 difference, 1 failed\n",
              result.out);
    EXPECT_EQ(Ascii("in the way"), ReadFile(there() + "/folder"));
}

TEST_F(ConvertTest, AppleDoubleFilesOfNoObjectAreFilesLikeAnyOther) {
    const Bytes apple_double = Hex("00 05 16 07  00 02 00 00  00*16  00 00");
    const std::string source = volumes_.Make("source", 1);
    WriteFile(source + "/._gone", apple_double);
    WriteFile(source + "/._text", Ascii("not what its name says"));
    for (const char* type : {"0", "1", "2", "7"}) {
        SCOPED_TRACE(type);
        const ToolResult result = volumes_.Convert(source, there() + type, type);
        EXPECT_THAT(result, Succeeded());
        EXPECT_EQ("3 converted, 3 compared, 0 differences, 0 failed\n", result.out);
        EXPECT_THAT(Tree(there() + type), ElementsAre("._gone", "._text"));
        EXPECT_EQ(apple_double, ReadFile(there() + type + "/._gone"));
        EXPECT_EQ(Ascii("not what its name says"), ReadFile(there() + type + "/._text"));
    }
    EXPECT_THAT(Tree(source), ElementsAre("._gone", "._text"));
}

TEST_F(ConvertTest, NamesOfOneFileStayNamesOfOneFile) {
    const std::string source = volumes_.Make("source", 1);
    WriteFile(source + "/one", Ascii("data"));
    ASSERT_EQ(0, link((source + "/one").c_str(), (source + "/two").c_str()));
    volumes_.Set(source + "/two", "colour", Ascii("blue"));
    EXPECT_THAT(volumes_.Convert(source, there(), "0"), Succeeded());
    EXPECT_TRUE(std::filesystem::equivalent(there() + "/one", there() + "/two"));
    EXPECT_THAT(Tree(there()), ElementsAre("._two", "one", "two"));
}

// ---- The command line ---------------------------------------------------------------------------

TEST_F(ConvertTest, TypesThatCannotBeAreRefused) {
    const std::string source = volumes_.Make("source", 1);
    for (const char* type : {"bogus", "13", "-1"}) {
        const ToolResult result =
            volumes_.Run({"convert", "--to=" + std::string(type), source, there()});
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, HasSubstr("mavoea: --to")) << type;
    }
    EXPECT_EQ(
        "mavoea: --to bogus: unknown volume type \"bogus\"; take a number from 0 to 12, "
        "appledouble, eadir, fileea, xattr, samba, samba-stream, samba-all-streams, netatalk, "
        "netatalk-samba or linux; Samba's streams_depot and \"fruit:resource = xattr\" are not "
        "known\n",
        volumes_.Convert(source, there(), "bogus").err);
    for (const char* type : {"4", "8", "9", "11"}) {
        const ToolResult result = volumes_.Convert(source, there(), type);
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err,
                    HasSubstr(there() + ": volumes of type " + type + " keep no metadata; "));
    }
    EXPECT_FALSE(Exists(there()));
}

TEST_F(ConvertTest, ASourceWhoseVolumeKeepsNoMetadataIsRefused) {
    const std::string source = volumes_.Make("source", 4);
    const ToolResult result = volumes_.Convert(source, there(), "0");
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr(source + ": volumes of type 4 keep no metadata; "));
    EXPECT_FALSE(Exists(there()));
}

TEST_F(ConvertTest, TheTwoPlacesLieApart) {
    const std::string source = volumes_.Make("source", 1);
    MakeDir(source + "/folder");
    WriteFile(source + "/folder/file", Ascii("data"));
    ASSERT_EQ(0, symlink(source.c_str(), (volumes_.path() + "/link").c_str()));
    const struct {
        std::string from;
        std::string to;
    } cases[] = {
        {source, source},
        {source, source + "/copy"},
        {source, source + "/folder/../copy"},
        {source, volumes_.path() + "/link/copy"},
        {source + "/folder", source},
        {source + "/folder/file", source + "/folder/file"},
    };
    const std::vector<std::string> before = Tree(volumes_.path());
    for (const auto& [from, to] : cases) {
        EXPECT_THAT(volumes_.Convert(from, to, "0"),
                    Failed(2, to + ": it and the source are not apart; name a place outside of "
                                   "the source"));
    }
    EXPECT_EQ(before, Tree(volumes_.path()));
    // Beside the source is apart from it.
    EXPECT_THAT(volumes_.Convert(source + "/folder", source + "/folder 2", "1"), Succeeded());
}

TEST_F(ConvertTest, ASourceOrAParentThatIsNotThereIsTold) {
    const std::string source = volumes_.Make("source", 1);
    EXPECT_THAT(volumes_.Convert(source + "/none", there(), "0"),
                Failed(1, source + "/none: No such file or directory; check the path"));
    EXPECT_THAT(volumes_.Convert(source, there() + "/below", "0"),
                Failed(1, there() + "/below: No such file or directory; check the path"));
    EXPECT_EQ("2", std::to_string(volumes_.Convert(source, "", "0").status));
}

}  // namespace
}  // namespace mavoea::test

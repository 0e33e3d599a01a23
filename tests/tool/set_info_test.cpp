// mavoea set-info: what is asked for lies where each kind of volume keeps it, byte for byte, and
// everything else stays.

#include <gtest/gtest.h>
#include <sys/xattr.h>

#include <filesystem>
#include <map>
#include <optional>

#include "tests/support/snapshot.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using nlohmann::json;
using ::testing::HasSubstr;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";
const std::string kComment = "com.apple.metadata:kMDItemFinderComment";
const std::string kTags = "com.apple.metadata:_kMDItemUserTags";
const std::string kColour = "com.example.colour";
const std::string kRecord = "user.org.netatalk.Metadata";

// Binary property lists: "Grüße" in UTF-16; "Dear diary"; "Home"; "Home" and "More" in red.
Bytes Greetings() {
    return Hex("'bplist00' 65 0047 0072 00FC 00DF 0065 08 00*6 01 01 00*7 01 00*8 00*7 13");
}
Bytes DearDiary() { return Hex("'bplist00' 5A 'Dear diary' 08 00*6 01 01 00*7 01 00*8 00*7 13"); }
Bytes HomeTag() { return Hex("'bplist00' A1 01 54 'Home' 08 0A 00*6 01 01 00*7 02 00*8 00*7 0F"); }
Bytes HomeAndMoreTags() {
    return Hex(
        "'bplist00' A2 01 02 54 'Home' 56 'More' 0A '6' 08 0B 10 00*6 01 01 00*7 03 00*8 00*7 17");
}

std::optional<Bytes> ExtendedAttribute(const std::string& path, const std::string& name) {
    Bytes value(70000);
    const ssize_t size = lgetxattr(path.c_str(), name.c_str(), value.data(), value.size());
    if (size < 0) return std::nullopt;
    value.resize(static_cast<std::size_t>(size));
    return value;
}

Bytes Part(const Bytes& bytes, std::size_t at, std::size_t size) {
    if (bytes.size() < at + size) return {};
    const auto begin = bytes.begin() + static_cast<std::ptrdiff_t>(at);
    return Bytes(begin, begin + static_cast<std::ptrdiff_t>(size));
}

// A directory of a type that is declared by its name, with a file in it.
class InfoShare {
 public:
    explicit InfoShare(std::string type) : type_(std::move(type)) {
        WriteFile(file(), Ascii("data"));
        std::filesystem::create_directory(folder());
    }

    const std::string& path() const { return dir_.path(); }
    std::string file() const { return dir_ / "a"; }
    std::string folder() const { return dir_ / "folder"; }

    ToolResult Run(Arguments arguments, const std::string& input = {}) const {
        arguments.insert(arguments.begin(), {"--volume", path() + '=' + type_});
        return RunTool(arguments, input);
    }
    ToolResult SetInfo(Arguments options) const {
        options.insert(options.begin(), {"set-info", file()});
        return Run(options);
    }
    void Set(const std::string& name, const Bytes& value) const {
        ASSERT_THAT(Run({"set", file(), name}, {value.begin(), value.end()}), Succeeded());
    }
    std::optional<Bytes> Get(const std::string& name) const { return Get(file(), name); }
    std::optional<Bytes> Get(const std::string& path, const std::string& name) const {
        const ToolResult result = Run({"get", path, name});
        if (result.status != 0) return std::nullopt;
        return result.bytes();
    }
    json Described() const { return Run({"--json", "show", file()}).json(); }

 private:
    TempDir dir_;
    std::string type_;
};

class SetInfoTest : public ::testing::TestWithParam<const char*> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(share_.path());
    }

    const InfoShare share_{GetParam()};
};

INSTANTIATE_TEST_SUITE_P(Kinds, SetInfoTest,
                         ::testing::Values("eadir", "appledouble", "fileea", "samba",
                                           "samba-stream", "netatalk", "linux"),
                         [](const auto& tested) {
                             std::string name = tested.param;
                             std::replace(name.begin(), name.end(), '-', '_');
                             return name;
                         });

// ---- Finder info --------------------------------------------------------------------------------

TEST_P(SetInfoTest, WhatIsLockedIsChangedAndStaysLocked) {
    ASSERT_THAT(share_.Run({"lock", share_.file()}), Succeeded());
    EXPECT_THAT(share_.SetInfo({"--type", "TEXT", "--comment", "Dear diary"}), Succeeded());
    EXPECT_EQ(Hex("'TEXT' 00*28"), share_.Get(kFinderInfo));
    EXPECT_EQ(DearDiary(), share_.Get(kComment));
    EXPECT_EQ(Ascii("1"), share_.Get("mavoea.locked"));
}

TEST_P(SetInfoTest, FinderInfoIsChangedWhereItIsAskedForAndStaysElsewhere) {
    share_.Set(kFinderInfo, Hex("'OLD!' 'made' 88 41 00 14 FF F0 01 02") + Pattern(16, 1));
    share_.Set(kFork, Ascii("fork"));
    share_.Set(kColour, Ascii("blue"));
    EXPECT_THAT(share_.SetInfo({"--type", "TEXT", "--creator", "\\x00ä\\\\x", "--label", "red",
                                "--flags", "invisible,-stationery,has-bundle"}),
                Succeeded());
    // On desk, alias and shared stay.
    EXPECT_EQ(Hex("'TEXT' 00 8A 5C 'x' E0 4D 00 14 FF F0 01 02") + Pattern(16, 1),
              share_.Get(kFinderInfo));
    EXPECT_EQ(Ascii("fork"), share_.Get(kFork));
    EXPECT_EQ(Ascii("blue"), share_.Get(kColour));
    EXPECT_THAT(share_.SetInfo({"--label=0"}), Succeeded());
    EXPECT_EQ(Hex("'TEXT' 00 8A 5C 'x' E0 41 00 14 FF F0 01 02") + Pattern(16, 1),
              share_.Get(kFinderInfo));
}

TEST_P(SetInfoTest, WhatSaysNothingAnyMoreGoes) {
    EXPECT_THAT(share_.SetInfo({"--flags", "alias", "--comment", "x", "--tags", "y"}), Succeeded());
    EXPECT_TRUE(share_.Get(kFinderInfo));
    EXPECT_THAT(share_.SetInfo({"--flags", "-alias", "--comment", "", "--tags", ""}), Succeeded());
    EXPECT_FALSE(share_.Get(kFinderInfo));
    EXPECT_FALSE(share_.Get(kComment));
    EXPECT_FALSE(share_.Get(kTags));
    EXPECT_FALSE(share_.Described().contains("afpComment"));
    EXPECT_THAT(share_.SetInfo({"--flags", "-alias", "--comment", "", "--tags", ""}), Succeeded());
}

TEST_P(SetInfoTest, ADirectoryKeepsItsWindowAndHasNoType) {
    const Bytes window = Hex("0028 FFC4 0190 0258 0000 FFFF 0064 0100 0005 FFFA 00*12");
    ASSERT_THAT(share_.Run({"set", share_.folder(), kFinderInfo}, {window.begin(), window.end()}),
                Succeeded());
    EXPECT_THAT(share_.Run({"set-info", share_.folder(), "--label", "orange"}), Succeeded());
    Bytes orange = window;
    orange[9] = 0x0E;
    EXPECT_EQ(orange, share_.Get(share_.folder(), kFinderInfo));
    EXPECT_THAT(
        share_.Run({"set-info", share_.folder(), "--type", "TEXT", "--label", "0"}),
        Failed(2, share_.folder() + ": a directory has no type and no creator; name files only"));
    EXPECT_EQ(orange, share_.Get(share_.folder(), kFinderInfo));
}

// ---- Comment and tags ---------------------------------------------------------------------------

TEST_P(SetInfoTest, ACommentIsAPropertyListAsMacsHaveIt) {
    EXPECT_THAT(share_.SetInfo({"--comment", "Dear diary"}), Succeeded());
    EXPECT_EQ(DearDiary(), share_.Get(kComment));
    EXPECT_THAT(share_.SetInfo({"--comment", "Grüße"}), Succeeded());
    EXPECT_EQ(Greetings(), share_.Get(kComment));
    EXPECT_EQ("Grüße", share_.Described().at("comment"));
    EXPECT_THAT(share_.SetInfo({"--comment", "[x,y]"}), Succeeded());
    EXPECT_EQ("[x,y]", share_.Described().at("comment"));
    EXPECT_EQ(2, share_.SetInfo({"--comment", "\xFF"}).status);
    EXPECT_EQ("[x,y]", share_.Described().at("comment"));
}

TEST_P(SetInfoTest, TagsAreAPropertyListAndTheLabelFollowsThem) {
    EXPECT_THAT(share_.SetInfo({"--label", "grey", "--tags", "Home"}), Succeeded());
    EXPECT_EQ(HomeTag(), share_.Get(kTags));
    EXPECT_EQ("grey", share_.Described().at("finderInfo").at("label"));
    EXPECT_THAT(share_.SetInfo({"--tag", "More:red"}), Succeeded());
    EXPECT_EQ(HomeAndMoreTags(), share_.Get(kTags));
    EXPECT_EQ("red", share_.Described().at("finderInfo").at("label"));
    EXPECT_THAT(share_.SetInfo({"--label", "blue"}), Succeeded());
    EXPECT_EQ(HomeAndMoreTags(), share_.Get(kTags));
    EXPECT_THAT(share_.SetInfo({"--untag", "More", "--untag", "None"}), Succeeded());
    EXPECT_EQ(HomeTag(), share_.Get(kTags));
    EXPECT_FALSE(share_.Get(kFinderInfo));
    EXPECT_THAT(share_.SetInfo({"--tags", "Home,a:b,12:30:4", "--tag", "x,y:1"}), Succeeded());
    EXPECT_EQ(R"([{"colour":"none","colourNumber":0,"name":"Home"},)"
              R"({"colour":"none","colourNumber":0,"name":"a:b"},)"
              R"({"colour":"blue","colourNumber":4,"name":"12:30"},)"
              R"({"colour":"grey","colourNumber":1,"name":"x,y"}])",
              share_.Described().at("tags").dump());
    EXPECT_EQ("blue", share_.Described().at("finderInfo").at("label"));
}

TEST_P(SetInfoTest, TagsThatCannotBeReadAreNotLost) {
    share_.Set(kTags, DearDiary());
    EXPECT_THAT(share_.SetInfo({"--tag", "x", "--type", "TEXT"}),
                Failed(2, share_.file() + ": its \"" + kTags +
                              "\" cannot be changed: it is no array of texts; remove it, or give "
                              "all tags with --tags"));
    EXPECT_EQ(DearDiary(), share_.Get(kTags));
    EXPECT_FALSE(share_.Get(kFinderInfo));
    EXPECT_THAT(share_.SetInfo({"--tags", "Home"}), Succeeded());
    EXPECT_EQ(HomeTag(), share_.Get(kTags));
}

// ---- What is refused ----------------------------------------------------------------------------

TEST_P(SetInfoTest, WordsThatMeanNothingChangeNothing) {
    share_.Set(kFinderInfo, Pattern(32, 1));
    const Snapshot before = TakeSnapshot(share_.path());
    for (const Arguments& words : std::vector<Arguments>{{},
                                                         {"--type", "ABC"},
                                                         {"--type", "ABCDE"},
                                                         {"--type", "AB\\x0"},
                                                         {"--type", "ABC日"},
                                                         {"--creator", ""},
                                                         {"--label", "pink"},
                                                         {"--label", "8"},
                                                         {"--flags", "invisible,nothing"},
                                                         {"--flags", "invisible,-invisible"},
                                                         {"--flags", ""},
                                                         {"--tags", "a,,b"},
                                                         {"--tag", ":red"},
                                                         {"--tag", "a\nb"},
                                                         {"--backup-date", "yesterday"},
                                                         {"--backup-date", "2024-02-30"},
                                                         {"--backup-date", "2024-05-01T24:00:00Z"},
                                                         {"--backup-date", "2068-01-20"},
                                                         {"--created", "1931-12-13"}}) {
        SCOPED_TRACE(::testing::PrintToString(words));
        const ToolResult result = share_.SetInfo(words);
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, HasSubstr("; "));
        EXPECT_EQ(before, TakeSnapshot(share_.path()));
    }
}

TEST_P(SetInfoTest, AFailureDoesNotKeepTheOthersFromBeingChanged) {
    const std::string missing = share_.path() + "/none";
    const ToolResult result = share_.Run(
        {"--json", "set-info", missing, share_.folder(), share_.file(), "--type", "TEXT"});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr(missing + ": "));
    EXPECT_THAT(result.err, HasSubstr(share_.folder() + ": "));
    EXPECT_EQ(json::array({{{"path", share_.file()}, {"changed", {kFinderInfo}}}}), result.json());
    EXPECT_EQ(Ascii("TEXT") + Bytes(28), share_.Get(kFinderInfo));
    EXPECT_EQ(1, share_.Run({"set-info", missing, share_.file(), "--type", "TEXT"}).status);
}

// ---- Where records have it ----------------------------------------------------------------------

class RecordInfoTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(netatalk_.path());
    }

    static Bytes RecordOf(const InfoShare& share) {
        return ExtendedAttribute(share.file(), kRecord).value_or(Bytes());
    }

    const InfoShare netatalk_{"netatalk"};
    const InfoShare samba_{"samba"};
    const InfoShare stream_{"samba-stream"};
    const InfoShare linux_{"linux"};
    const InfoShare apple_double_{"appledouble"};
    const InfoShare ea_directory_{"eadir"};
};

TEST_F(RecordInfoTest, FinderInfoAndCommentLieInTheRecord) {
    ASSERT_THAT(netatalk_.SetInfo({"--type", "TEXT", "--label", "red", "--comment", "Grüße"}),
                Succeeded());
    const Bytes record = RecordOf(netatalk_);
    ASSERT_EQ(402U, record.size());
    EXPECT_EQ(Hex("'TEXT' 00*5 0C 00*22"), Part(record, 122, 32));
    EXPECT_EQ(Hex("00000004 0000009A 00000005"), Part(record, 26, 12));
    EXPECT_EQ(Hex("'Gr' 9F A7 'e' 00*195"), Part(record, 154, 200));  // Mac OS Roman
    EXPECT_EQ(Greetings(), ExtendedAttribute(netatalk_.file(), "user." + kComment));
    // What Mac OS Roman has no letters for is UTF-8.
    ASSERT_THAT(netatalk_.SetInfo({"--comment", "日"}), Succeeded());
    EXPECT_EQ(Hex("E6 97 A5 00*197"), Part(RecordOf(netatalk_), 154, 200));
    EXPECT_EQ("日", netatalk_.Described().at("afpComment"));
    ASSERT_THAT(netatalk_.SetInfo({"--comment", ""}), Succeeded());
    EXPECT_EQ(Bytes(200), Part(RecordOf(netatalk_), 154, 200));
    EXPECT_EQ(Hex("'TEXT' 00*5 0C 00*22"), Part(RecordOf(netatalk_), 122, 32));
}

TEST_F(RecordInfoTest, AnEaDirectoryHasTheCommentInTheResourceFile) {
    ASSERT_THAT(ea_directory_.SetInfo({"--type", "TEXT", "--comment", "Dear diary"}), Succeeded());
    const Bytes file = ReadFile(ea_directory_.path() + "/@eaDir/a@MavoResource");
    EXPECT_EQ(Ascii("Dear diary"), Part(file, 437, 10));
    EXPECT_EQ(Ascii("TEXT"), Part(file, 653, 4));
}

TEST_F(RecordInfoTest, OtherKindsHaveNoSecondComment) {
    for (const InfoShare* const share : {&stream_, &linux_, &apple_double_}) {
        ASSERT_THAT(share->SetInfo({"--comment", std::string(300, 'x')}), Succeeded());
        EXPECT_EQ(Bytes(), RecordOf(*share));
        EXPECT_FALSE(share->Described().contains("afpComment"));
        EXPECT_EQ(std::string(300, 'x'), share->Described().at("comment"));
    }
}

TEST_F(RecordInfoTest, ACommentThatARecordHasNoRoomForIsRefused) {
    for (const InfoShare* const share : {&netatalk_, &samba_, &ea_directory_}) {
        ASSERT_THAT(share->SetInfo({"--comment", std::string(200, 'x')}), Succeeded());
        const Snapshot before = TakeSnapshot(share->path());
        const ToolResult result = share->SetInfo({"--comment", std::string(201, 'x'), "--label=1"});
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, HasSubstr("there is no place for comment (it has more than the 200 "
                                          "bytes"));
        EXPECT_EQ(before, TakeSnapshot(share->path()));
    }
}

TEST_F(RecordInfoTest, DatesLieInTheRecord) {
    ASSERT_THAT(netatalk_.SetInfo({"--backup-date", "2024-05-01T09:30:00Z"}), Succeeded());
    EXPECT_EQ(Hex("80000000 80000000 2DC4C818 80000000"), Part(RecordOf(netatalk_), 354, 16));
    ASSERT_THAT(netatalk_.SetInfo({"--created", "1999-12-31 23:59:59"}), Succeeded());
    EXPECT_EQ(Hex("FFFFFFFF 80000000 2DC4C818 80000000"), Part(RecordOf(netatalk_), 354, 16));
}

TEST_F(RecordInfoTest, ADateWithoutAPlaceIsRefusedByName) {
    ASSERT_THAT(apple_double_.SetInfo({"--tags", "Home"}), Succeeded());
    EXPECT_THAT(apple_double_.SetInfo({"--backup-date", "2024-05-01"}),
                Failed(2, apple_double_.file() +
                              ": there is no place for file dates (a \"._\" file with attributes "
                              "has no place for it); nothing has been changed"));
}

// An unknown time of creation is one in 2068 to Samba.
TEST_F(RecordInfoTest, SambaIsGivenNoRecordWithoutATimeOfCreation) {
    const ToolResult refused = samba_.SetInfo({"--backup-date", "2024-05-01T09:30:00Z"});
    EXPECT_EQ(2, refused.status);
    EXPECT_THAT(refused.err, HasSubstr("give it one with --created"));
    EXPECT_EQ(Bytes(), RecordOf(samba_));
    ASSERT_THAT(samba_.SetInfo({"--created", "2000-01-01T00:00:07Z"}), Succeeded());
    EXPECT_EQ(Bytes(), RecordOf(samba_));
    EXPECT_EQ("2000-01-01T00:00:07Z", samba_.Described().at("dates").at("createdForSmb"));
    ASSERT_THAT(samba_.SetInfo({"--backup-date", "2024-05-01T09:30:00Z"}), Succeeded());
    EXPECT_EQ(Hex("00000007 80000000 2DC4C818 80000000"), Part(RecordOf(samba_), 354, 16));

    // With streams it lies beside the Finder info, behind 12 bytes.
    ASSERT_THAT(stream_.SetInfo({"--type", "TEXT", "--backup-date", "2024-05-01T09:30:00Z",
                                 "--created", "2000-01-01T00:00:07Z"}),
                Succeeded());
    const auto info = ExtendedAttribute(stream_.file(), "user.DosStream.AFP_AfpInfo:$DATA");
    EXPECT_EQ(Hex("2DC4C818 'TEXT'"), Part(info.value_or(Bytes()), 12, 8));
    EXPECT_EQ(Bytes(), RecordOf(stream_));
    EXPECT_EQ("2000-01-01T00:00:07Z", stream_.Described().at("dates").at("createdForSmb"));
}

TEST_F(RecordInfoTest, WhatNobodyHasDeclaredIsNotWrittenBeside) {
    ASSERT_THAT(netatalk_.SetInfo({"--type", "TEXT"}), Succeeded());
    const Snapshot before = TakeSnapshot(netatalk_.path());
    const ToolResult result = RunTool({"set-info", netatalk_.file(), "--type", "ABCD"});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("netatalk"));
    EXPECT_EQ(before, TakeSnapshot(netatalk_.path()));
}

TEST_F(RecordInfoTest, ACommentOfAMacsFileIsNotLeftBehindByANewOne) {
    // A "._" file of comment, Finder info and fork.
    WriteFile(
        apple_double_.path() + "/._a",
        Hex("00051607 00020000 00*16 0003 00000004 0000003E 00000003 00000009 00000041 00000020"
            "00000002 00000061 00000000 'old' 'TEXTttxt' 00*24"));
    ASSERT_EQ("old", apple_double_.Described().at("afpComment"));
    const Snapshot before = TakeSnapshot(apple_double_.path());
    const ToolResult result = apple_double_.SetInfo({"--comment", "new"});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("there is no place for comment"));
    EXPECT_EQ(before, TakeSnapshot(apple_double_.path()));
}

}  // namespace
}  // namespace mavoea::test

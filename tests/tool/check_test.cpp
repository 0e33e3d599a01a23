// mavoea check: each kind of thing that may be amiss, put on disk byte by byte; what is sound; and
// what cannot be looked at.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <set>
#include <sstream>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/snapshot.h"
#include "tests/tool/habits.h"
#include "tests/tool/holdings.h"
#include "tests/tool/stopped_tool.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;
using ::testing::UnorderedElementsAre;

const std::string kRecord = "user.org.netatalk.Metadata";

std::vector<std::string> LinesOf(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

std::string TextOfFile(const std::string& path) {
    std::ifstream in(path);
    return {std::istreambuf_iterator<char>(in), {}};
}

std::vector<nlohmann::json> JsonLines(const ToolResult& result) {
    std::vector<nlohmann::json> all;
    for (const std::string& line : LinesOf(result.out)) all.push_back(nlohmann::json::parse(line));
    return all;
}

Bytes ColourStream() {
    return StreamImage{.attributes = {{"colour", Ascii("blue")}}, .fork = Ascii("fork")}.Build();
}

class CheckTest : public ::testing::Test {
 protected:
    void SetUp() override { MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path()); }

    std::string Add(const std::string& name) const {
        WriteFile(dir_ / name, Ascii("data of " + name));
        return dir_ / name;
    }

    ToolResult Run(Arguments arguments) const {
        if (!type_.empty()) {
            arguments.insert(arguments.begin(), {"--volume", dir_.path() + "=" + type_});
        }
        return RunTool(arguments);
    }
    ToolResult Check(const Arguments& options = {}) const {
        Arguments arguments = options;
        arguments.insert(arguments.end(), {"check", "-r", dir_.path()});
        return Run(arguments);
    }

    std::string Relative(const std::string& path) const {
        const std::string prefix = dir_.path() + "/";
        return path.starts_with(prefix) ? path.substr(prefix.size()) : path;
    }

    // What is found in the whole directory, sorted: "KIND PATH" or "KIND PATH FILE". Text and JSON
    // have to say the same, and nothing may change.
    std::vector<std::string> Found(int status = 1) const {
        const Snapshot before = TakeSnapshot(dir_.path());
        const ToolResult text = Check();
        const ToolResult result = Check({"--json"});
        EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
        EXPECT_EQ(status, text.status) << text.out << text.err;
        EXPECT_EQ(status, result.status) << result.out << result.err;
        std::vector<nlohmann::json> lines = JsonLines(result);
        std::vector<std::string> found;
        if (lines.empty()) return found;
        const nlohmann::json summary = lines.back();
        lines.pop_back();
        std::erase_if(lines, [](const nlohmann::json& one) { return !one.contains("kind"); });
        EXPECT_EQ(lines.size(), summary["findings"]);
        const std::vector<std::string> said = LinesOf(text.out);
        EXPECT_EQ(lines.size(), said.size());
        for (std::size_t i = 0; i < std::min(lines.size(), said.size()); ++i) {
            const std::string path = lines[i]["path"];
            const std::string kind = lines[i]["kind"];
            const std::string detail = lines[i]["detail"];
            std::string line = kind + " " + Relative(path);
            if (lines[i].contains("file")) line += " " + Relative(lines[i]["file"]);
            found.push_back(line);
            EXPECT_THAT(said[i], AllOf(StartsWith(path + ": " + kind + ": "), HasSubstr(detail)));
        }
        std::sort(found.begin(), found.end());
        return found;
    }

    nlohmann::json First() const {
        const auto lines = JsonLines(Check({"--json"}));
        return lines.empty() ? nlohmann::json() : lines.front();
    }

    const TempDir dir_;
    std::string type_ = "eadir";
};

// ---- What is sound ------------------------------------------------------------------------------

class SoundTest : public CheckTest, public ::testing::WithParamInterface<const char*> {};
INSTANTIATE_TEST_SUITE_P(Volumes, SoundTest,
                         ::testing::Values("eadir", "appledouble", "fileea", "xattr", "samba",
                                           "samba-stream", "samba-all-streams", "netatalk",
                                           "netatalk-samba", "linux"),
                         [](const auto& tested) {
                             std::string name = tested.param;
                             std::erase(name, '-');
                             return name;
                         });

TEST_P(SoundTest, WhatTheToolHasWrittenHasNothingAmiss) {
    MAVOEA_SKIP_UNLESS_ROOT();
    type_ = GetParam();
    MakeDir(dir_ / "sub");
    const std::string attribute = type_ == "xattr" ? "user.colour" : "colour";
    std::vector<std::string> objects = {Add("file"), Add("private"), Add("locked"), dir_ / "sub",
                                        Add("sub/file")};
    Add("without");
    ASSERT_EQ(0, chmod(objects[1].c_str(), 0640));
    ASSERT_EQ(0, lchown(objects[1].c_str(), 4321, 1234));
    for (const std::string& object : objects) {
        ASSERT_THAT(Run({"set", object, attribute, "blue"}), Succeeded());
        if (type_ == "xattr") continue;  // the file systems of tests take no other names
        ASSERT_THAT(Run({"set", object, kFinderInfoName, "--hex", std::string(64, '7')}),
                    Succeeded());
        if (object == dir_ / "sub") continue;
        ASSERT_THAT(Run({"set", object, kForkName, "fork"}), Succeeded());
    }
    ASSERT_THAT(Run({"lock", objects[2]}), Succeeded());
    EXPECT_THAT(Found(0), IsEmpty());
    EXPECT_THAT(Check(), Succeeded());
}

TEST_F(CheckTest, MacsFilesAreSoundOnAnAppleDoubleVolume) {
    type_ = "appledouble";
    int number = 0;
    for (const MacFile& file : AllMacFiles()) {
        PutAppleDouble(Add("mac" + std::to_string(number++)), file.bytes);
    }
    EXPECT_THAT(Found(0), IsEmpty());
}

// ---- Damage -------------------------------------------------------------------------------------

TEST_F(CheckTest, ADamagedStreamIsToldWithThePlaceOfTheDamage) {
    const std::string object = Add("a");
    Bytes stream = ColourStream();
    stream.resize(stream.size() - 1);  // the fork passes its end
    PutStream(object, stream);
    const std::string size = std::to_string(stream.size());
    const std::string offset = std::to_string(stream.size() - 3);
    const std::string detail = "entry 1 (resource fork): bytes " + offset + " to " + size +
                               " pass the end of the file at " + size;
    EXPECT_EQ(object + ": damaged-stream: " + dir_ / "@eaDir/a@MavoEAStream" + ": " + detail +
                  " (id 2, offset " + offset + ", length 4, size " + size + ")\n",
              Check().out);
    const nlohmann::json found = First();
    EXPECT_EQ((nlohmann::json{{"path", object},
                              {"kind", "damaged-stream"},
                              {"detail", detail},
                              {"file", dir_ / "@eaDir/a@MavoEAStream"},
                              {"entry", 1},
                              {"id", 2},
                              {"offset", stream.size() - 3},
                              {"length", 4},
                              {"size", stream.size()}}),
              found);
    EXPECT_THAT(Found(), ElementsAre("damaged-stream a @eaDir/a@MavoEAStream"));
}

TEST_F(CheckTest, ADamagedAttributeOfAStreamIsToldWithItsName) {
    StreamImage image{.attributes = {{"colour", Ascii("blue")}, {"size", Ascii("big")}}};
    Bytes stream = image.Build();
    PutU32(stream, image.RecordAt(1), 9999);
    PutStream(Add("a"), stream);
    const auto lines = JsonLines(Check({"--json"}));
    ASSERT_LE(2U, lines.size());
    for (std::size_t i = 0; i + 1 < lines.size(); ++i) {
        EXPECT_EQ("damaged-stream", lines[i]["kind"]);
        EXPECT_EQ("size", lines[i]["attribute"]);
        EXPECT_EQ(9999, lines[i]["offset"]);
        EXPECT_EQ(3, lines[i]["length"]);
        EXPECT_EQ(stream.size(), lines[i]["size"]);
    }
}

TEST_F(CheckTest, ADamagedAppleDoubleFileIsToldAndSoIsOneThatIsNone) {
    type_ = "appledouble";
    Bytes cut = ClassicFile(Pattern(32), Pattern(100)).bytes;
    cut.resize(100);
    PutAppleDouble(Add("a"), cut);
    PutAppleDouble(Add("text"), Ascii("not what its name says"));
    PutAppleDouble(Add("empty"), {});
    EXPECT_THAT(Found(), ElementsAre("damaged-appledouble a ._a", "damaged-appledouble text ._text",
                                     "mac-ignores-file text ._text"));
}

TEST_F(CheckTest, ADamagedResourceFileIsTold) {
    Bytes cut = ClassicFile(Pattern(32), Pattern(100)).bytes;
    cut.resize(100);
    PutResource(Add("a"), cut);
    EXPECT_THAT(Found(), ElementsAre("damaged-resource-file a @eaDir/a@MavoResource"));
}

TEST_F(CheckTest, ADamagedRecordIsToldWhereverItIs) {
    Bytes head = NetatalkFile(Pattern(32), Pattern(100)).bytes;
    for (std::size_t at = 26; at < 26 + 13 * 12; at += 12) {
        if (U32At(head, at) == kCommentEntry) PutU32(head, at, 16);  // which is no id
    }
    PutResource(Add("head"), head);
    EXPECT_THAT(Found(), ElementsAre("damaged-record head @eaDir/head@MavoResource"));

    type_ = "fileea";
    Bytes record = AttributeRecord();
    PutU32(record, 26, 10);
    SetFileAttribute(Add("record"), "user.netatalk.Metadata", record);
    SetFileAttribute(Add("sound"), "user.netatalk.Metadata", AttributeRecord());
    EXPECT_THAT(Found(), ElementsAre("damaged-record head @eaDir/head@MavoResource",
                                     "damaged-record record"));
}

TEST_F(CheckTest, AnotherProgramsDamagedAttributesAreTold) {
    type_ = "samba-stream";
    SetFileAttribute(Add("cut"), "user.DosStream.AFP_AfpInfo:$DATA", Repeat(0, 30));
    SetFileAttribute(Add("no bytes"), "user.DosStream.colour:$DATA", {});
    SetFileAttribute(Add("parts"), "user.DosStream.colour:$DATA", Ascii("abc") + Bytes{2});
    SetFileAttribute(dir_ / "parts", "user.DosStreamExt.1.colour:$DATA", Ascii("def"));
    EXPECT_THAT(Found(), ElementsAre("damaged-attribute cut", "damaged-attribute no bytes",
                                     "damaged-attribute parts"));
    SetFileAttribute(dir_ / "parts", "user.DosStreamExt.2.colour:$DATA", Ascii("ghi"));
    EXPECT_THAT(Found(), ElementsAre("damaged-attribute cut", "damaged-attribute no bytes"));
}

TEST_F(CheckTest, FinderInfoOfAnotherSizeIsDamage) {
    type_ = "linux";
    SetFileAttribute(Add("a"), "user.com.apple.FinderInfo", Pattern(31));
    EXPECT_THAT(Found(), ElementsAre("damaged-attribute a"));
}

TEST_F(CheckTest, WhatStandsInThePlaceOfMetadataAndIsNoFileIsTold) {
    const std::string object = Add("a");
    MakeDir(dir_ / "@eaDir");
    ASSERT_EQ(0, symlink("/etc/passwd", (dir_ / "@eaDir/a@MavoEAStream").c_str()));
    ASSERT_EQ(0, mkfifo((dir_ / "@eaDir/a@MavoResource").c_str(), 0600));
    EXPECT_THAT(Found(),
                ElementsAre("no-file a @eaDir/a@MavoEAStream", "no-file a @eaDir/a@MavoResource"));
}

TEST_F(CheckTest, AnEaDirectoryThatIsALinkIsToldOnce) {
    for (const char* name : {"a", "b", "c"}) Add(name);
    ASSERT_EQ(0, symlink("/tmp", (dir_ / "@eaDir").c_str()));
    EXPECT_THAT(Found(), ElementsAre("no-file @eaDir"));
}

TEST_F(CheckTest, ADirectoryInThePlaceOfAnAppleDoubleFileIsTold) {
    type_ = "appledouble";
    Add("a");
    ASSERT_EQ(0, symlink("a", (dir_ / "._a").c_str()));
    EXPECT_THAT(Found(), ElementsAre("no-file a ._a"));
}

// ---- Rights -------------------------------------------------------------------------------------

TEST_F(CheckTest, MetadataOfOtherRightsThanItsObjectIsTold) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS(dir_.path());
    for (const char* name : {"mode", "owner", "group", "acl", "program", "run", "same"}) {
        ASSERT_EQ(0, chmod(Add(name).c_str(), 0640));
        PutStream(dir_ / name, ColourStream());
        ASSERT_EQ(0, chmod((dir_ / "@eaDir/" + name + "@MavoEAStream").c_str(), 0640));
    }
    ASSERT_EQ(0, chmod((dir_ / "program").c_str(), 0750));
    ASSERT_EQ(0, chmod((dir_ / "@eaDir/program@MavoEAStream").c_str(), 0740));
    ASSERT_EQ(0, chmod((dir_ / "@eaDir/run@MavoEAStream").c_str(), 0740));
    ASSERT_EQ(0, chmod((dir_ / "@eaDir/mode@MavoEAStream").c_str(), 0644));
    ASSERT_EQ(0, chown((dir_ / "@eaDir/owner@MavoEAStream").c_str(), 4321, 0));
    ASSERT_EQ(0, chown((dir_ / "@eaDir/group@MavoEAStream").c_str(), 0, 4321));
    // user: rw-; user 2: r--; group: r--; mask: r--; others: none.
    SetFileAttribute(
        dir_ / "@eaDir/acl@MavoEAStream", "system.posix_acl_access",
        Hex("02 00 00 00  01 00 06 00 FF FF FF FF  02 00 04 00 02 00 00 00"
            "04 00 04 00 FF FF FF FF  10 00 04 00 FF FF FF FF  20 00 00 00 FF FF FF FF"));
    EXPECT_THAT(Found(), ElementsAre("other-rights acl @eaDir/acl@MavoEAStream",
                                     "other-rights group @eaDir/group@MavoEAStream",
                                     "other-rights mode @eaDir/mode@MavoEAStream",
                                     "other-rights owner @eaDir/owner@MavoEAStream",
                                     "other-rights run @eaDir/run@MavoEAStream"));
    EXPECT_THAT(Check().out, AllOf(HasSubstr("its mode is 0644, not 0640\n"),
                                   HasSubstr("its owner is 4321, not 0\n"),
                                   HasSubstr("its group is 4321, not 0\n")));
}

// ---- What belongs to nobody ---------------------------------------------------------------------

TEST_F(CheckTest, MetadataWithoutItsObjectIsTold) {
    Add("here");
    for (const char* kind : {"MavoEAStream", "Thumbnail"})
        PutKind(dir_ / "gone", kind, ColourStream());
    PutLegacy(dir_ / "left", "colour", Ascii("blue"));
    PutAppleDouble(dir_ / "gone", ClassicFile(Pattern(32), {}).bytes);
    PutKind(dir_ / "gone", "MavoResourceTmp", ColourStream());
    EXPECT_THAT(
        Found(),
        ElementsAre("dangling-metadata ._gone", "dangling-metadata @eaDir/gone@MavoEAStream",
                    "dangling-metadata @eaDir/left", "dangling-service-file @eaDir/gone@Thumbnail",
                    "unfinished-repair @eaDir/gone@MavoResourceTmp"));
}

TEST_F(CheckTest, AnEaDirectoryWithNothingInItIsTold) {
    Add("here");
    MakeDir(dir_ / "@eaDir");
    EXPECT_THAT(Found(), ElementsAre("empty-ea-directory @eaDir"));
}

TEST_F(CheckTest, NamesThatShortenToOneAreTold) {
    const std::string head(241, 'n');
    const std::string one = head + "abcdefghi";
    const std::string other = head + "ihgfedcba";
    Add(one);
    Add(other);
    Add(head + "abcdefghj");
    EXPECT_THAT(Found(), ElementsAre("shared-names " + other));
    EXPECT_THAT(Check().out, HasSubstr(dir_ / one + "\n"));
    EXPECT_THAT(Run({"check", dir_ / one}).out,
                AllOf(HasSubstr(": shared-names: "), HasSubstr(dir_ / other + "\n")));
    type_ = "appledouble";
    EXPECT_THAT(Found(0), IsEmpty());
}

// ---- Where it lies ------------------------------------------------------------------------------

TEST_F(CheckTest, WhatLiesInAnEarlierLayoutIsTold) {
    PutLegacy(Add("folder"), "colour", Ascii("blue"));
    PutLegacy(dir_ / "folder", "MAVO:Resource", ClassicFile(Pattern(32), {}).bytes);
    PutLegacy(dir_ / "folder", "MAVO:Other", Ascii("of a service"));
    PutAppleDouble(Add("mac"), MacSidecar({{{"a", Ascii("1")}}, Pattern(32), {}}).bytes);
    EXPECT_THAT(Found(), ElementsAre("earlier-layout folder @eaDir/folder/MAVO:Other",
                                     "earlier-layout folder @eaDir/folder/MAVO:Resource",
                                     "earlier-layout folder @eaDir/folder/colour",
                                     "earlier-layout mac ._mac"));
}

TEST_F(CheckTest, WhatAnUpgradeThatWasCutShortHasLeftIsTold) {
    const std::string object = Add("a");
    PutStream(object, ColourStream());
    PutResource(object, ClassicFile(Pattern(32), Ascii("fork")).bytes);
    PutLegacy(object, "size", Ascii("big"));
    PutLegacy(object, "MAVO:Resource", ClassicFile(Pattern(32), Ascii("fork")).bytes);
    std::vector<std::string> found = Found();
    // The stream has a fork of its own.
    std::erase_if(found, [](const std::string& one) { return one.starts_with("differing"); });
    EXPECT_THAT(found, ElementsAre("stranded-metadata a @eaDir/a/MAVO:Resource",
                                   "stranded-metadata a @eaDir/a/size"));
}

TEST_F(CheckTest, WhatLiesInTheWrongPlaceForTheVolumeIsTold) {
    const std::string object = Add("a");
    PutStream(object, ColourStream());
    PutAppleDouble(object, MacSidecar({{{"a", Ascii("1")}}, Pattern(32), {}}).bytes);
    EXPECT_THAT(Found(), ElementsAre("misplaced-metadata a ._a"));
    PutResource(object, ClassicFile(Repeat(0, 32), Ascii("fork")).bytes);
    PutLegacy(object, "size", Ascii("big"));
    for (const char* type : {"appledouble", "samba", "linux", "xattr"}) {
        SCOPED_TRACE(type);
        type_ = type;
        std::vector<std::string> found = Found();
        std::erase_if(found, [](const std::string& one) { return one.starts_with("smbd-"); });
        std::vector<std::string> expected = {"misplaced-metadata a @eaDir/a/size",
                                             "misplaced-metadata a @eaDir/a@MavoEAStream",
                                             "misplaced-metadata a @eaDir/a@MavoResource"};
        if (type_ == "linux" || type_ == "xattr") {
            expected.insert(expected.begin(), "misplaced-metadata a ._a");
        }
        EXPECT_EQ(expected, found);
    }
}

TEST_F(CheckTest, AttributesInAResourceFileAreTold) {
    PutResource(Add("a"), ColourStream());
    EXPECT_THAT(Found(), ElementsAre("misplaced-attributes a @eaDir/a@MavoResource"));
}

TEST_F(CheckTest, TwoPlacesThatDifferAreTold) {
    type_ = "fileea";
    const std::string object = Add("a");
    SetFileAttribute(object, "user.netatalk.Metadata", RecordOf({.finder_info = Pattern(32, 1)}));
    PutResource(object, ClassicFile(Pattern(32, 2), {}).bytes);
    SetFileAttribute(Add("same"), "user.netatalk.Metadata",
                     RecordOf({.finder_info = Pattern(32, 1)}));
    PutResource(dir_ / "same", ClassicFile(Pattern(32, 1), {}).bytes);
    EXPECT_THAT(Found(), ElementsAre("differing-values a @eaDir/a@MavoResource"));
}

// ---- What runs that were cut short have left ----------------------------------------------------

TEST_F(CheckTest, WhatRunsHaveLeftIsTold) {
    const std::string object = Add("a");
    Add(".mavoea-0123abcd");
    Add(".mavoea-moving-0123456789ABCDEF");
    MakeDir(dir_ / ".mavoea-12345-0123456789abcdef");
    // What waits in there is looked at when the rename comes to its end.
    PutAppleDouble(dir_ / ".mavoea-12345-0123456789abcdef/a", ClassicFile(Pattern(32), {}).bytes);
    PutResource(object, ClassicFile(Pattern(32), {}).bytes);
    PutKind(object, "MavoResourceTmp", ClassicFile(Pattern(32), {}).bytes);
    WriteFile(dir_ / "@eaDir/.mavoea-0123abcd", {});
    EXPECT_THAT(Found(), ElementsAre("left-temporary-file .mavoea-0123abcd",
                                     "left-temporary-file @eaDir/.mavoea-0123abcd",
                                     "unfinished-move .mavoea-moving-0123456789ABCDEF",
                                     "unfinished-rename .mavoea-12345-0123456789abcdef",
                                     "unfinished-repair a @eaDir/a@MavoResourceTmp"));
}

// ---- What other programs would not read ---------------------------------------------------------

Bytes ForkFile(const Bytes& fork, const std::string& filler = "Netatalk        ") {
    Bytes file = PlainAppleDouble(Pattern(32), fork);
    const Bytes text = Ascii(filler);
    std::copy(text.begin(), text.end(), file.begin() + 8);
    return file;
}

TEST_F(CheckTest, AppleDoubleFilesThatSmbdIgnoresAreToldWithTheReason) {
    struct Case {
        const char* name;
        Bytes bytes;
        std::string reason;
    };
    StreamImage many{.attributes = {}, .filler = Ascii("Netatalk        ")};
    for (int i = 0; i < 1025; ++i) many.attributes.push_back({"a" + std::to_string(i), {}});
    StreamImage large{.attributes = {{"a", Pattern(65536)}}};
    Bytes no_magic = ColourStream();
    PutU32(no_magic, kAttributeMagicAt, 0);
    Bytes elsewhere = PlainAppleDouble(Pattern(32), Ascii("fork"), 2);
    elsewhere.insert(elsewhere.begin() + 50, 4, 0);
    PutU32(elsewhere, kFinderOffsetAt, 54);
    PutU32(elsewhere, kForkOffsetAt, 86);
    Bytes behind = PlainAppleDouble(Pattern(32), {}, 2);
    PutU32(behind, kForkOffsetAt, 500);
    const std::vector<Case> cases = {
        {"entries", NetatalkFile(Pattern(32), Pattern(10)).bytes, "it has 13 entries, not 2"},
        {"elsewhere", elsewhere, "its Finder info is at 54, not at 50"},
        {"many", many.Build(), "it has 1025 attributes, more than 1024"},
        {"large", large.Build(), "bytes, more than 65536"},
        {"magic", no_magic, "\"ATTR\" is not at 84"},
        {"behind", behind, "its fork begins behind its end"},
    };
    type_ = "samba";
    std::vector<std::string> expected;
    for (const Case& one : cases) {
        PutAppleDouble(Add(one.name), one.bytes);
        expected.push_back(std::string("smbd-ignores-file ") + one.name + " ._" + one.name);
    }
    PutAppleDouble(Add("sound"), ForkFile(Ascii("fork")));
    PutAppleDouble(Add("mac"), AllMacFiles()[0].bytes);
    std::vector<std::string> found = Found();
    std::erase_if(found, [](const std::string& one) { return !one.starts_with("smbd-ignores"); });
    std::sort(expected.begin(), expected.end());
    EXPECT_EQ(expected, found);
    const std::string out = Check().out;
    for (const Case& one : cases) {
        EXPECT_THAT(out, HasSubstr(dir_ / one.name + ": smbd-ignores-file: " + dir_ / "._" +
                                   one.name + ": "));
        EXPECT_THAT(out, HasSubstr(one.reason));
    }
    // Other volumes are none of smbd's.
    type_ = "netatalk";
    EXPECT_THAT(Check().out, Not(HasSubstr("smbd-")));
}

TEST_F(CheckTest, AForkThatIsCutIsReadBySmbd) {
    type_ = "samba";
    Bytes cut = ForkFile(Pattern(100));
    cut.resize(100);
    PutAppleDouble(Add("a"), cut);
    EXPECT_THAT(Found(), ElementsAre("damaged-appledouble a ._a"));
}

TEST_F(CheckTest, AMacsFileWithNothingToConvertOverridesTheClientsFinderInfo) {
    type_ = "samba";
    PutAppleDouble(Add("a"), ForkFile(Ascii("fork"), "Mac OS X        "));
    PutAppleDouble(Add("blank"), ForkFile(BlankFork(), "Mac OS X        "));
    PutAppleDouble(Add("attributes"), MacSidecar({{{"a", Ascii("1")}}, Pattern(32), {}}).bytes);
    PutAppleDouble(Add("samba"), ForkFile(Ascii("fork")));
    EXPECT_THAT(Found(), ElementsAre("smbd-overrides-finder-info a ._a"));
}

TEST_F(CheckTest, RecordsThatSmbdRefusesAreTold) {
    type_ = "samba";
    Bytes cut = AttributeRecord();
    cut.resize(401);
    SetFileAttribute(Add("cut"), kRecord, cut);
    Bytes seven = AttributeRecord();
    PutU16(seven, 24, 7);
    SetFileAttribute(Add("seven"), kRecord, seven);
    SetFileAttribute(Add("long"), kRecord, AttributeRecord() + Bytes{0});
    Bytes comment = AttributeRecord();
    PutU32(comment, 26 + 12 + 8, 201);
    SetFileAttribute(Add("comment"), kRecord, comment);
    Bytes no_offset = AttributeRecord();
    PutU32(no_offset, 26 + 4 * 12 + 4, 0);
    SetFileAttribute(Add("offset"), kRecord, no_offset);
    Bytes dates = AttributeRecord();
    PutU32(dates, 26 + 2 * 12 + 8, 15);
    SetFileAttribute(Add("dates"), kRecord, dates);
    SetFileAttribute(Add("sound"), kRecord, AttributeRecord());
    std::vector<std::string> found = Found();
    std::erase_if(found, [](const std::string& one) { return one.starts_with("damaged-"); });
    EXPECT_THAT(found, ElementsAre("smbd-refuses-record comment", "smbd-refuses-record cut",
                                   "smbd-refuses-record dates", "smbd-refuses-record long",
                                   "smbd-refuses-record offset", "smbd-refuses-record seven"));
    const std::string out = Check().out;
    EXPECT_THAT(out, HasSubstr("it has 401 bytes, not 402: smbd removes it at the next look"));
    EXPECT_THAT(out, HasSubstr("it has 403 bytes, not 402: smbd ignores it"));
}

TEST_F(CheckTest, AStreamWithoutItsNulIsTold) {
    type_ = "samba";
    SetFileAttribute(Add("a"), "user.DosStream.colour:$DATA", Ascii("blue"));
    SetFileAttribute(Add("b"), "user.DosStream.colour:$DATA", Ascii("blue") + Bytes{0});
    EXPECT_THAT(Found(), ElementsAre("smbd-cuts-value a"));
}

TEST_F(CheckTest, AppleDoubleFilesThatMacsIgnoreAreTold) {
    type_ = "appledouble";
    Bytes early = PlainAppleDouble(Pattern(32), Ascii("fork"));
    PutU32(early, kFinderOffsetAt, 20);
    PutAppleDouble(Add("early"), early);
    PutAppleDouble(Add("many"), PlainAppleDouble(Pattern(32), {}, 16));
    std::vector<std::string> found = Found();
    std::erase_if(found, [](const std::string& one) { return one.starts_with("damaged-"); });
    EXPECT_THAT(found,
                ElementsAre("mac-ignores-file early ._early", "mac-ignores-file many ._many"));
}

// ---- Whose it is --------------------------------------------------------------------------------

TEST_F(CheckTest, AnotherProgramsMetadataThatNobodyHasDeclaredIsToldOnceADirectory) {
    type_.clear();
    MakeDir(dir_ / "sub");
    for (const char* name : {"a", "b", "sub/c", "sub/d"}) {
        SetFileAttribute(Add(name), "user.DosStream.colour:$DATA", Ascii("blue") + Bytes{0});
        PutAppleDouble(dir_ / name, ForkFile(Ascii("fork")));
    }
    WriteFile(dir_ / "sub/._c", ForkFile(Ascii("fork")));
    WriteFile(dir_ / "sub/._d", NetatalkFile(Pattern(32), Pattern(10)).bytes);
    std::vector<std::string> found = Found();
    EXPECT_THAT(found, ElementsAre("smbd-ignores-file sub/d sub/._d", "undeclared-metadata a",
                                   "undeclared-metadata sub/c"));
    EXPECT_THAT(Check().out, HasSubstr("; --volume PATH=samba declares it"));
    type_ = "samba";
    EXPECT_THAT(Found(), ElementsAre("smbd-ignores-file sub/d sub/._d"));
}

// ---- What cannot be looked at -------------------------------------------------------------------

TEST_F(CheckTest, WhatIsMissingIsAFailure) {
    const ToolResult result = Run({"check", dir_ / "none"});
    EXPECT_THAT(result, Failed(2, dir_ / "none" + ": No such file or directory; check the path"));
    EXPECT_EQ("", result.out);
}

TEST_F(CheckTest, WhatCannotBeReadIsAFailureWhateverElseIsFound) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    PutStream(Add("closed"), ColourStream());
    PutStream(Add("damaged"), Ascii("no stream"));
    ASSERT_EQ(0, chmod((dir_ / "@eaDir/closed@MavoEAStream").c_str(), 0600));
    ASSERT_EQ(0, chmod(dir_.path().c_str(), 0755));
    const Arguments arguments = {"--volume", dir_.path() + "=1", "--json", "check",
                                 "-r",       dir_.path()};
    const ToolResult result = RunTool(arguments, {}, {.user = 54321});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err,
                StartsWith("mavoea: " + dir_ / "@eaDir/closed@MavoEAStream: Permission denied; "));
    const auto lines = JsonLines(result);
    ASSERT_EQ(3U, lines.size()) << result.out;
    EXPECT_EQ(dir_ / "@eaDir/closed@MavoEAStream", lines[0]["path"]);
    EXPECT_THAT(lines[0]["failure"].get<std::string>(), HasSubstr("Permission denied"));
    EXPECT_EQ("damaged-stream", lines[1]["kind"]);
    EXPECT_EQ((nlohmann::json{{"checked", 3},
                              {"findings", 1},
                              {"inUse", 0},
                              {"failed", 1},
                              {"kinds", {{"damaged-stream", 1}}}}),
              lines[2]);
}

TEST_F(CheckTest, AVolumeThatKeepsNothingIsAFailure) {
    type_ = "11";
    EXPECT_EQ(2, Run({"check", Add("a")}).status);
}

TEST_F(CheckTest, WhatAServiceHasLockedIsNoFault) {
    const std::string object = Add("a");
    PutStream(object, Ascii("half of a stream"));
    PutResource(Add("b"), ClassicFile(Pattern(32), {}).bytes);
    PutKind(dir_ / "b", "MavoResourceTmp", {});
    const HeldLock stream(dir_ / "@eaDir/a@MavoEAStream");
    const HeldLock copy(dir_ / "@eaDir/b@MavoResourceTmp");
    const ToolResult result = Check();
    EXPECT_EQ(0, result.status);
    EXPECT_EQ("", result.out);
    EXPECT_EQ("mavoea: note: " + dir_ / "@eaDir/a@MavoEAStream" +
                  ": in use by another process: not looked into\n" +
                  "mavoea: note: " + dir_ / "@eaDir/b@MavoResourceTmp" +
                  ": in use by another process: not looked into\n",
              result.err);
    EXPECT_EQ(dir_ / "@eaDir/a@MavoEAStream", First()["path"]);
    EXPECT_THAT(First()["inUse"].get<std::string>(), HasSubstr("in use by another process"));
}

// A fork of 12 MiB is read in pieces; what has become of it in between shows that it is.
TEST_F(CheckTest, LargeValuesAreReadToTheirEnd) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    const std::string object = Add("a");
    PutResource(object, ClassicFile(Pattern(32), Pattern(std::size_t{12} << 20)).bytes);
    const std::string file = dir_ / "@eaDir/a@MavoResource";
    const Bytes bytes = BytesIn(file);
    // A first run counts the reads; in the others the file is cut before one of them.
    int count = 0;
    for (int nth = 0; nth <= count; nth += 3) {
        WriteFile(file, bytes);
        int reads = 0;
        const StoppedRun run = RunStopped(
            {"--volume", dir_.path() + "=1", "check", object}, dir_.path(),
            [&](const FileCall& call) {
                if (call.open_file != file || !call.name.starts_with("pread")) return true;
                if (++reads == nth) {
                    EXPECT_EQ(0, truncate(file.c_str(), 1 << 20));
                }
                return true;
            },
            Stops::kAtDataToo);
        if (nth == 0) count = reads;
        EXPECT_EQ(nth == 0, run.status == 0) << nth << ": " << run.out << run.err;
    }
    EXPECT_LT(12, count);
}

TEST_F(CheckTest, NoCallThatItMakesCouldChangeAnything) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    const std::string object = Add("a");
    PutStream(object, ColourStream());
    PutStream(dir_ / "gone", ColourStream());
    PutResource(object, Ascii("no resource file"));
    PutLegacy(object, "size", Ascii("big"));
    Add(".mavoea-0123abcd");
    MakeDir(dir_ / ".mavoea-12345-0123456789abcdef");
    const StoppedRun run = RunStopped(
        {"--volume", dir_.path() + "=1", "check", "-r", dir_.path()}, dir_.path(),
        [](const FileCall& call) {
            EXPECT_FALSE(call.Changes()) << ::testing::PrintToString(call);
            return true;
        },
        Stops::kAtSyncsToo);
    EXPECT_EQ(1, run.status) << run.err;
    EXPECT_LT(20, run.calls);
}

// ---- What is said -------------------------------------------------------------------------------

TEST_F(CheckTest, OnlyWhatIsNamedIsCheckedUnlessAllIsWanted) {
    MakeDir(dir_ / "sub");
    PutStream(dir_ / "sub", Ascii("no stream"));
    PutStream(Add("sub/a"), Ascii("no stream"));
    PutStream(Add("b"), Ascii("no stream"));
    const std::vector<std::string> lines = LinesOf(Run({"check", dir_ / "sub"}).out);
    EXPECT_THAT(lines, ElementsAre(StartsWith(dir_ / "sub: damaged-stream: ")));
    EXPECT_THAT(LinesOf(Run({"check", "-r", dir_ / "sub"}).out),
                ElementsAre(StartsWith(dir_ / "sub: "), StartsWith(dir_ / "sub/a: ")));
    EXPECT_EQ("4 checked, 3 findings, 0 failed",
              LinesOf(Run({"check", "-r", "-v", dir_.path()}).out).back());
}

TEST_F(CheckTest, ALineHasOneFindingWhateverIsInAName) {
    const std::string name = "two\nlines\x1b[31m \xFF";
    PutStream(Add(name), Ascii("no stream"));
    EXPECT_THAT(LinesOf(Check().out),
                ElementsAre(StartsWith(dir_ / "two\\x0Alines\\x1B[31m \xFF: damaged-stream: ")));
    const nlohmann::json found = First();
    EXPECT_EQ(dir_ / "two\nlines\x1b[31m \xEF\xBF\xBD", found["path"]);
    EXPECT_THAT(found["pathHex"].get<std::string>(), EndsWith("20ff"));
    EXPECT_THAT(found["fileHex"].get<std::string>(), HasSubstr("20ff40"));
}

TEST(CheckMemoryTest, ItDoesNotGrowWithTheObjects) {
    constexpr int kObjects = 10000;
    constexpr int kDirectories = 100;
    constexpr std::size_t kMemory = std::size_t{9} << 20;
    const TempDir dir(FastDirectory());
    for (int i = 0; i < kDirectories; ++i) {
        const std::string sub = dir / std::to_string(i);
        MakeDir(sub);
        MakeDir(sub + "/@eaDir");
        for (int j = 0; j < kObjects / kDirectories; ++j) {
            const std::string name = std::string(200, 'n') + std::to_string(j);
            WriteFile(sub + '/' + name, {});
            WriteFile(sub + "/@eaDir/" + name + "@MavoEAStream", {1});
        }
    }
    const ToolResult result = RunTool({"--volume", dir.path() + "=1", "check", "-r", dir.path()},
                                      {}, {.memory = kMemory});
    EXPECT_EQ(1, result.status) << result.err;
    EXPECT_EQ(kObjects, static_cast<int>(LinesOf(result.out).size()));
}

// The table in the manual has what the help has, in its order, and nothing else.
TEST(CheckKindsTest, EveryKindIsInTheHelpAndInTheManual) {
    const auto words_behind = [](const std::string& text, const std::string& start) {
        std::vector<std::string> words;
        for (const std::string& line : LinesOf(text)) {
            if (!line.starts_with(start)) continue;
            const std::size_t end = line.find_first_of(" `", start.size());
            words.push_back(line.substr(start.size(), end - start.size()));
        }
        return words;
    };
    const ToolResult help = RunTool({"check", "--help"});
    EXPECT_THAT(help, Succeeded());
    const std::size_t at = help.out.find("Their kinds:\n");
    ASSERT_NE(std::string::npos, at);
    const auto in_help = words_behind(help.out.substr(at), "  ");
    EXPECT_EQ(26U, in_help.size());
    EXPECT_EQ(in_help, words_behind(TextOfFile(MAVOEA_CHECKING_MANUAL), "| `"));
}

}  // namespace
}  // namespace mavoea::test

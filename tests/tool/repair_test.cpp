// Resource files that wrongly hold attributes.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/kills.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";

std::string Counts(int repaired, int nothing, int failed) {
    return std::to_string(repaired) + " repaired, " + std::to_string(nothing) +
           " with nothing to repair, " + std::to_string(failed) + " failed\n";
}

class RepairTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        std::filesystem::create_directory(volume_.path() + "/@eaDir");
    }

    ToolResult Repair() const { return volume_.Run({"repair", volume_.object()}); }

    Volume volume_{GetParam()};
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, RepairTest, ::testing::ValuesIn(Types({1, 2, 3, 6, 10})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(RepairTest, AttributesGoIntoTheStreamAndTheRestStays) {
    for (const MacFile& file : AllMacFiles()) {
        SCOPED_TRACE(file.layout);
        const bool holds = !file.contents.attributes.empty();
        WriteFile(volume_.resource(), file.bytes);
        const ToolResult result = Repair();
        EXPECT_THAT(result, Succeeded());
        EXPECT_EQ(holds ? Counts(1, 0, 0) : Counts(0, 1, 0), result.out);
        if (!holds) {
            EXPECT_EQ(file.bytes, ReadFile(volume_.resource()));
            continue;
        }
        for (const auto& [name, value] : file.contents.attributes) {
            EXPECT_EQ(value, volume_.Get(name).bytes()) << name;
        }
        const auto left = ReadMacFile(ReadFile(volume_.resource()));
        ASSERT_TRUE(left);
        EXPECT_EQ((MacContents{{}, file.contents.finder_info, file.ForkInUse()}), *left);
        EXPECT_EQ(Counts(0, 1, 0), Repair().out);
    }
}

TEST_P(RepairTest, AValueThatWasLongerInTheStreamDoesNotKeepItsEnd) {
    ASSERT_THAT(volume_.Set("a", Ascii("a long value")), Succeeded());
    ASSERT_THAT(volume_.Set("other", Ascii("stays")), Succeeded());
    WriteFile(volume_.resource(), StreamImage{.attributes = {{"a", Ascii("new")}}}.Build());
    EXPECT_EQ(Counts(1, 0, 0), Repair().out);
    EXPECT_EQ("new", volume_.Get("a").out);
    EXPECT_EQ("stays", volume_.Get("other").out);
}

// Promise: "What may be left over: `@eaDir/<name>@MavoResourceTmp`"
TEST_P(RepairTest, TheUnfinishedFileOfTheLibrarysRepairIsLeftToBeRemoved) {
    WriteFile(volume_.resource(), StreamImage{.attributes = {{"a", Ascii("new")}}}.Build());
    WriteFile(volume_.resource() + "Tmp", Ascii("half of"));
    EXPECT_EQ(Counts(1, 0, 0), Repair().out);
    EXPECT_EQ("new", volume_.Get("a").out);
    EXPECT_EQ(Ascii("half of"), ReadFile(volume_.resource() + "Tmp"));
}

TEST_P(RepairTest, ObjectsWithoutAResourceFileHaveNothingToRepair) {
    EXPECT_THAT(Repair(), Succeeded());
    EXPECT_EQ(Counts(0, 1, 0), Repair().out);
    WriteFile(volume_.resource(), {});
    EXPECT_EQ(Counts(0, 1, 0), Repair().out);
    EXPECT_EQ(Bytes(), ReadFile(volume_.resource()));
    EXPECT_FALSE(Exists(volume_.stream()));
}

// Three entries: Finder info of 40 bytes at 240 over an attribute area with the attribute "a", one
// of that id and 7 bytes at 280, a fork of 4 bytes. The attribute header is where it always is.
Bytes WithThirdEntry(std::uint32_t id) {
    Bytes file =
        Hex("00 05 16 07  00 02 00 00  00*16  00 03 "
            "00 00 00 09  00 00 00 F0  00 00 00 28 "
            "00 00 00 02  00 00 01 1F  00 00 00 04 "
            "00 00 00 00  00 00 01 18  00 00 00 07 "
            "00*20 00 00 'ATTR' 00 00 00 00 "
            "00 00 00 8B  00 00 00 88  00 00 00 03  00*12  00 00 00 01 "
            "00 00 00 88  00 00 00 03  00 00  02  'a' 00  00 00 00 'xyz'");
    PutU32(file, 50, id);
    file.resize(240);
    return file + Pattern(40) + Ascii("commentfork");
}

TEST_P(RepairTest, AFileThatWouldLoseAnEntryIsNotChanged) {
    Bytes file = WithThirdEntry(0x63);
    WriteFile(volume_.resource(), file);
    const ToolResult result = Repair();
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(Counts(0, 0, 1), result.out);
    EXPECT_EQ("mavoea: " + volume_.resource() +
                  ": a repair would lose its entry of id 0x00000063: a resource file has no place "
                  "for it; move the file away if that is no loss\n",
              result.err);
    EXPECT_EQ(file, ReadFile(volume_.resource()));
    EXPECT_FALSE(Exists(volume_.stream()));

    // Without any bytes it is no loss.
    PutU32(file, 58, 0);
    WriteFile(volume_.resource(), file);
    EXPECT_THAT(Repair(), Succeeded());
    EXPECT_EQ(Hex("00051607 00020000 'Mac OS X        ' 0002"
                  "00000009 00000032 00000020"
                  "00000002 00000052 00000004") +
                  Pattern(32) + Ascii("fork"),
              ReadFile(volume_.resource()));
    EXPECT_EQ("xyz", volume_.Get("a").out);
}

// Promise: "AppleDouble: A resource file, or a "._" file"
// Promise: "AppleDouble: real name"
// Promise: "AppleDouble: comment"
// Promise: "AppleDouble: file dates"
// Promise: "AppleDouble: Finder info"
// Promise: "AppleDouble: AFP directory id"
// Promise: "AppleDouble: AFP file info"
// Promise: "AppleDouble: AFP short name"
// Promise: "AppleDouble: ProDOS file info"
// Promise: "AppleDouble: private device"
// Promise: "AppleDouble: resource fork"
TEST_P(RepairTest, ACommentIsKeptInAHeadOfThirteenEntries) {
    WriteFile(volume_.resource(), WithThirdEntry(4));
    const ToolResult result = Repair();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(1, 0, 0), result.out);
    EXPECT_EQ("xyz", volume_.Get("a").out);
    const Bytes file = ReadFile(volume_.resource());
    EXPECT_EQ(kNetatalkHead + 4, file.size());
    EXPECT_EQ(13, U16At(file, 24));
    std::map<std::uint32_t, std::uint32_t> places;
    for (std::size_t at = 26; at < 182; at += 12) places[U32At(file, at)] = U32At(file, at + 4);
    const std::map<std::uint32_t, std::uint32_t> classic = {
        {3, 182},          {4, 437},          {8, 637},         {9, 653}, {15, 685},
        {14, 689},         {13, 693},         {11, 705},        {2, 741}, {0x80444556, 713},
        {0x80494E4F, 721}, {0x8053594E, 729}, {0x8053567E, 737}};
    EXPECT_EQ(classic, places);
    EXPECT_EQ((MacContents{{}, Pattern(32), Ascii("fork")}), ReadMacFile(file));
    auto entries = EntriesOf(file);
    EXPECT_EQ(Ascii("comment"), entries[4]);
    entries.erase(4);
    for (const auto& [id, bytes] : entries) EXPECT_EQ(Bytes(bytes.size()), bytes) << id;
    EXPECT_EQ(Counts(0, 1, 0), Repair().out);
}

TEST_P(RepairTest, DamageChangesNothing) {
    const StreamImage image{.attributes = {{"a", Ascii("one")}, {"b", Pattern(50)}},
                            .fork = Pattern(100)};
    const Bytes whole = image.Build();
    Bytes file = whole;
    PutU32(file, image.RecordAt(1), 0x7FFFFFFF);
    WriteFile(volume_.resource(), file);
    EXPECT_THAT(Repair().err, HasSubstr(": damaged: attribute \"b\" passes the end of the file; "));
    EXPECT_EQ(file, ReadFile(volume_.resource()));
    for (std::size_t size = 121; size < whole.size(); size += 11) {
        file.assign(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size));
        WriteFile(volume_.resource(), file);
        EXPECT_EQ(2, Repair().status) << size;
        EXPECT_EQ(file, ReadFile(volume_.resource())) << size;
    }
    EXPECT_FALSE(Exists(volume_.stream()));
    WriteFile(volume_.resource(), Ascii("no AppleDouble file, but text"));
    EXPECT_THAT(Repair().err, HasSubstr(": no AppleDouble file; "));
}

TEST_P(RepairTest, ALinkInTheResourceFilesPlaceIsNotFollowed) {
    const std::string target = volume_.path() + "/target";
    const Bytes file = StreamImage{.attributes = {{"a", Ascii("secret")}}}.Build();
    WriteFile(target, file);
    std::filesystem::create_symlink(target, volume_.resource());
    const std::string message =
        volume_.resource() +
        ": a symbolic link in the place of a file; see who put it there, and move it away";
    const ToolResult result = Repair();
    EXPECT_THAT(result, Failed(2, message));
    EXPECT_EQ(Counts(0, 0, 1), result.out);
    EXPECT_EQ(file, ReadFile(target));
    EXPECT_TRUE(std::filesystem::is_symlink(volume_.resource()));
    EXPECT_FALSE(Exists(volume_.stream()));
    const ToolResult list = volume_.List();
    EXPECT_THAT(list, Failed(2, message));
    EXPECT_EQ("", list.out);
}

TEST_P(RepairTest, ATreeIsRepairedThoughSomeOfItFails) {
    namespace fs = std::filesystem;
    const std::string sub = volume_.path() + "/sub";
    fs::create_directories(sub + "/@eaDir");
    const Bytes file =
        StreamImage{.attributes = {{"a", Ascii("1")}}, .fork = Ascii("fork")}.Build();
    for (const char* name : {"bad", "good"}) WriteFile(sub + "/" + name, {});
    WriteFile(sub + "/@eaDir/bad@MavoResource", Ascii("text"));
    WriteFile(sub + "/@eaDir/good@MavoResource", file);
    WriteFile(volume_.path() + "/@eaDir/sub@MavoResource", file);
    WriteFile(volume_.resource(), file);
    const ToolResult result = volume_.Run({"--json", "repair", "-r", volume_.path()});
    EXPECT_EQ(2, result.status);
    const auto json = result.json();
    EXPECT_EQ("repairing", json["task"]);
    EXPECT_EQ(3, json["done"]);
    EXPECT_EQ(1, json["nothing"]);
    EXPECT_EQ(1, json["failed"]);
    EXPECT_FALSE(json.contains("current"));
    EXPECT_EQ(sub + "/bad", json["failures"][0]["path"]);
    EXPECT_EQ("mavoea: " + json["failures"][0]["message"].get<std::string>() + "\n", result.err);
    EXPECT_EQ("1", volume_.Run({"get", sub + "/good", "a"}).out);
    EXPECT_EQ("1", volume_.Run({"get", sub, "a"}).out);
    EXPECT_EQ("1", volume_.Get("a").out);
}

// Each of the two files has something that goes into the other.
TEST_P(RepairTest, ARunThatIsKilledLosesNeitherTheStreamsForkNorTheResourcesAttributes) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    const Attribute one = {"one", Ascii("1")};
    const Attribute other = {"other", Ascii("2")};
    const int type = volume_.type();
    const Arguments arguments = {"--volume", volume_.path() + '=' + std::to_string(type), "repair",
                                 volume_.object()};
    const auto whole = [&] {
        const Holdings held = HoldingsOf(type, volume_.object());
        EXPECT_TRUE(held.HasAttribute(one));
        EXPECT_TRUE(held.HasAttribute(other));
        EXPECT_TRUE(held.HasFork(Ascii("fork")));
    };
    const auto make = [&] {
        PutResource(volume_.object(), StreamImage{.attributes = {one}}.Build());
        PutStream(volume_.object(),
                  StreamImage{.attributes = {other}, .fork = Ascii("fork")}.Build());
    };
    KillAtEachChange(arguments, volume_.path(), make, [&] {
        whole();
        EXPECT_EQ(0, RunTool(arguments).status);
        whole();
        EXPECT_THAT(RunTool({"--volume", volume_.path() + '=' + std::to_string(type), "check",
                             volume_.object()}),
                    Succeeded());
    });
}

TEST(RepairElsewhereTest, OtherVolumesAreToldSo) {
    for (const int type : {0, 5, 7}) {
        const Volume volume(type);
        const ToolResult result = volume.Run({"repair", volume.object()});
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, HasSubstr(": volumes of type " + std::to_string(type)));
        EXPECT_THAT(result.err, HasSubstr(", keep no EA directory; "));
    }
    for (const int type : {4, 8, 9, 11, 12}) {
        const Volume volume(type);
        const ToolResult result = volume.Run({"repair", "-r", volume.path()});
        EXPECT_EQ(2, result.status);
        EXPECT_EQ(Counts(0, 0, 1), result.out) << "once, not for everything below";
        EXPECT_THAT(result.err,
                    HasSubstr("volumes of type " + std::to_string(type) + " keep no metadata"));
    }
}

}  // namespace
}  // namespace mavoea::test

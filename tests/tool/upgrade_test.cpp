// Legacy layouts into the current one, one object and whole trees.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <optional>

#include "tests/support/mac_files.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

std::string Counts(int converted, int current, int nothing, int failed) {
    return std::to_string(converted) + " converted, " + std::to_string(current) +
           " already current, " + std::to_string(nothing) + " with nothing to convert, " +
           std::to_string(failed) + " failed\n";
}

// In seconds since 1970; 0 would count as never.
void SetAccessTime(const std::string& path, std::int64_t seconds) {
    timespec times[2] = {};
    times[0].tv_sec = static_cast<time_t>(seconds);
    times[1].tv_sec = 1000000000;
    ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, 0));
}

class UpgradeTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override { MAVOEA_SKIP_UNLESS_ROOT(); }

    ToolResult Upgrade() const { return volume_.Run({"upgrade", volume_.object()}); }

    std::string Folder() const { return volume_.path() + "/@eaDir/file.txt"; }

    // An attribute file of a legacy folder.
    static void AddLegacy(const std::string& folder, const std::string& name, const Bytes& value) {
        fs::create_directories(folder);
        WriteFile(folder + "/" + name, value);
        SetAccessTime(folder + "/" + name, 1500000000);
    }

    Volume volume_{GetParam()};
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, UpgradeTest, ::testing::ValuesIn(Types({1, 2, 3, 6, 10})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(UpgradeTest, AttributeFilesBecomeAStream) {
    AddLegacy(Folder(), "color", Ascii("blue"));
    AddLegacy(Folder(), "tags", Pattern(3000));
    const ToolResult result = Upgrade();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(1, 0, 0, 0), result.out);
    EXPECT_EQ(std::vector<std::string>{"file.txt@MavoEAStream"},
              NamesIn(volume_.path() + "/@eaDir"));
    EXPECT_EQ("blue", volume_.Get("color").out);
    EXPECT_EQ(Pattern(3000), volume_.Get("tags").bytes());
    EXPECT_EQ(Counts(0, 1, 0, 0), Upgrade().out);
}

// Promise: "What may be left over: a stream of 0 bytes"
TEST_P(UpgradeTest, WithoutTheEmptyStreamOfOneThatWasCutShortTheFolderIsConverted) {
    AddLegacy(Folder(), "color", Ascii("blue"));
    WriteFile(volume_.stream(), {});
    ASSERT_EQ(0, unlink(volume_.stream().c_str()));
    EXPECT_THAT(Upgrade(), Succeeded());
    EXPECT_EQ("blue", volume_.Get("color").out);
    EXPECT_FALSE(Exists(Folder()));
}

// Promise: "What may be left over: a stream with attributes"
TEST_P(UpgradeTest, WhatOneThatWasCutShortLeftInTheFolderIsSetByHand) {
    ASSERT_THAT(volume_.Set("color", Ascii("blue")), Succeeded());
    AddLegacy(Folder(), "tags", Pattern(3000));
    EXPECT_EQ("color\n", volume_.Run({"list", volume_.object()}).out);
    EXPECT_THAT(volume_.Run({"set", volume_.object(), "tags", "--file", Folder() + "/tags"}),
                Succeeded());
    EXPECT_EQ(Pattern(3000), volume_.Get("tags").bytes());
    EXPECT_EQ("blue", volume_.Get("color").out);
}

// What a metadata file holds, if there is one.
MacContents ContentsOf(const std::string& path) {
    if (!Exists(path)) return {};
    return ReadMacFile(ReadFile(path)).value_or(MacContents{{{"no", Ascii("AppleDouble file")}}});
}

using Entries = std::map<std::uint32_t, Bytes>;

// Those that say something.
Entries MeaningOf(Entries entries) {
    std::erase_if(entries,
                  [](const auto& entry) { return entry.second == Bytes(entry.second.size()); });
    return entries;
}

TEST_P(UpgradeTest, AnAppleDoubleFileIsSplitIntoStreamAndResourceFile) {
    for (const MacFile& file : AllMacFiles()) {
        SCOPED_TRACE(file.layout);
        const Volume volume(GetParam());
        WriteFile(volume.apple_double(), file.bytes);
        // Macintosh and MS-DOS file info, which have no place.
        const Entries entries = EntriesOf(file.bytes);
        const bool whole = !entries.contains(10) && !entries.contains(12);
        const ToolResult result = volume.Run({"upgrade", volume.object()});
        if (whole) {
            EXPECT_THAT(result, Succeeded());
            EXPECT_EQ(Counts(1, 0, 0, 0), result.out);
            EXPECT_FALSE(Exists(volume.apple_double()));
        }
        EXPECT_EQ((MacContents{file.contents.attributes, Bytes(32), {}}),
                  ContentsOf(volume.stream()));
        EXPECT_EQ((MacContents{{}, file.contents.finder_info, file.ForkInUse()}),
                  ContentsOf(volume.resource()));
        for (const auto& [name, value] : file.contents.attributes) {
            EXPECT_EQ(value, volume.Get(name).bytes()) << name;
        }
        if (file.contents.finder_info != Bytes(32)) {
            EXPECT_EQ(file.contents.finder_info, volume.Get("com.apple.FinderInfo").bytes());
        }
        EXPECT_EQ(file.ForkInUse(), volume.Get("com.apple.ResourceFork").bytes());
    }
}

TEST_P(UpgradeTest, OtherEntriesOfAnAppleDoubleFileGoAlong) {
    const MacFile file = NetatalkFile(Pattern(32, 1), Ascii("fork"));
    WriteFile(volume_.apple_double(), file.bytes);
    EXPECT_THAT(Upgrade(), Succeeded());
    EXPECT_FALSE(Exists(volume_.apple_double()));
    EXPECT_EQ(MeaningOf(EntriesOf(file.bytes)), MeaningOf(EntriesOf(ReadFile(volume_.resource()))));
    EXPECT_EQ("1", volume_.Get("mavoea.locked").out);
}

TEST_P(UpgradeTest, AnAppleDoubleFileWithEntriesThatHaveNoPlaceStays) {
    const MacFile file = ThirteenEntryFile(Pattern(32, 1), Ascii("fork"));
    WriteFile(volume_.apple_double(), file.bytes);
    const std::string why =
        std::string(GetParam() == 2 ? "neither a record nor a resource file" : "a resource file") +
        " has no place for it)";
    for (int i = 0; i < 2; ++i) {
        const ToolResult result = Upgrade();
        EXPECT_THAT(result,
                    Failed(2, volume_.object() +
                                  ": not all that an earlier version kept could be converted: "
                                  "Macintosh file info (" +
                                  why + ", MS-DOS file info (" + why +
                                  "; see where it lies with: mavoea list -l PATH"));
        EXPECT_EQ(Counts(0, 0, 0, 1), result.out);
        EXPECT_EQ(file.bytes, ReadFile(volume_.apple_double()));
    }
}

TEST_P(UpgradeTest, AnAppleDoubleFileThatWasReadLaterLeavesTheAttributeFiles) {
    AddLegacy(Folder(), "color", Ascii("blue"));
    WriteFile(volume_.apple_double(), StreamImage{.attributes = {{"a", Ascii("1")}}}.Build());
    SetAccessTime(volume_.apple_double(), 1600000000);
    const ToolResult result = Upgrade();
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(Counts(1, 0, 0, 0), result.out);
    EXPECT_EQ("mavoea: note: " + volume_.object() + ": 1 file stays in " + Folder() +
                  ": its AppleDouble file was read later and has been taken\n",
              result.err);
    EXPECT_EQ("a\n", volume_.List().out);
    const ToolResult again = Upgrade();
    EXPECT_EQ(Counts(0, 1, 0, 0), again.out);
    EXPECT_EQ("mavoea: note: " + volume_.object() + ": 1 file stays in " + Folder() +
                  ": it has an EA stream already\n",
              again.err);
    EXPECT_EQ(Ascii("blue"), ReadFile(Folder() + "/color"));
}

TEST_P(UpgradeTest, ALegacyResourceFileMovesAndItsMarksGoToTheObject) {
    Bytes file = OneEntry(14, 400, 4, 741);
    PutU16(file, 402, 0x0020);
    AddLegacy(Folder(), "MAVO:Resource", file);
    ASSERT_EQ(0, chmod(volume_.object().c_str(), 0644));
    EXPECT_EQ(Counts(1, 0, 0, 0), Upgrade().out);
    EXPECT_EQ(file, ReadFile(volume_.resource()));
    EXPECT_EQ(0444, ModeOf(volume_.object()));
    EXPECT_FALSE(Exists(Folder()));
}

TEST_P(UpgradeTest, ALegacyResourceFileBesideACurrentOneStaysUnderItsName) {
    AddLegacy(Folder(), "MAVO:Resource", PlainAppleDouble(Pattern(32, 1), {}));
    WriteFile(volume_.resource(), PlainAppleDouble(Pattern(32, 2), {}));
    EXPECT_EQ(Counts(0, 1, 0, 0), Upgrade().out);
    EXPECT_EQ(std::vector<std::string>{"MAVO:Resource"}, NamesIn(Folder()));
    EXPECT_EQ(PlainAppleDouble(Pattern(32, 2), {}), ReadFile(volume_.resource()));
}

TEST_P(UpgradeTest, AResourceFileThatIsNoneMovesWithANote) {
    AddLegacy(Folder(), "MAVO:Resource", Ascii("text"));
    const ToolResult result = Upgrade();
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(Counts(1, 0, 0, 0), result.out);
    EXPECT_EQ("mavoea: note: " + volume_.object() +
                  ": its legacy resource file says nothing of its read-only and hidden marks\n",
              result.err);
    EXPECT_EQ(Ascii("text"), ReadFile(volume_.resource()));
}

TEST_P(UpgradeTest, OtherReservedNamesChangeInTheFolder) {
    AddLegacy(Folder(), "MAVO:Icon", Ascii("icon"));
    AddLegacy(Folder(), "MAVO:Other thing", Ascii("other"));
    AddLegacy(Folder(), "MAVOplain", Ascii("no colon"));
    AddLegacy(Folder(), "a:b", Ascii("no attribute"));
    const ToolResult result = Upgrade();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(1, 0, 0, 0), result.out);
    EXPECT_EQ((std::vector<std::string>{"MAVO@Icon", "MAVO@Other thing", "MAVOplain", "a:b"}),
              NamesIn(Folder()));
    EXPECT_EQ(Counts(0, 0, 1, 0), Upgrade().out);
}

TEST_P(UpgradeTest, EveryKindOfAnObjectIsConvertedAtOnce) {
    AddLegacy(Folder(), "color", Ascii("blue"));
    AddLegacy(Folder(), "MAVO:Resource", PlainAppleDouble(Pattern(32), Ascii("fork")));
    AddLegacy(Folder(), "MAVO:Icon", Ascii("icon"));
    EXPECT_EQ(Counts(1, 0, 0, 0), Upgrade().out);
    EXPECT_EQ(std::vector<std::string>{"MAVO@Icon"}, NamesIn(Folder()));
    EXPECT_EQ("color\ncom.apple.FinderInfo\ncom.apple.ResourceFork\n", volume_.List().out);
}

TEST_P(UpgradeTest, WhatCannotBeReadStaysAndIsNamedWhileTheRestIsConverted) {
    AddLegacy(Folder(), "color", Ascii("blue"));
    fs::create_directory(Folder() + "/directory");
    AddLegacy(Folder(), "MAVO:Resource", PlainAppleDouble(Pattern(32), {}));
    const ToolResult result = Upgrade();
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(Counts(0, 0, 0, 1), result.out);
    EXPECT_EQ(
        "mavoea: " + volume_.object() +
            ": 1 file of its legacy folder could not be converted, \"directory\"; see whether "
            "they can be read, and store them with: mavoea set PATH NAME --file FILE\n",
        result.err);
    EXPECT_EQ("blue", volume_.Get("color").out);
    EXPECT_TRUE(Exists(volume_.resource()));
    EXPECT_TRUE(Exists(Folder() + "/directory"));
}

TEST_P(UpgradeTest, ANameThatIsTooLongForAnAppleDoubleFileIsNotTooLong) {
    const std::string name(254, 'n');
    const std::string object = volume_.path() + "/" + name;
    WriteFile(object, {});
    EXPECT_EQ(Counts(0, 0, 1, 0), volume_.Run({"upgrade", object}).out);
    AddLegacy(volume_.path() + "/@eaDir/" + name, "color", Ascii("blue"));
    const ToolResult result = volume_.Run({"upgrade", object});
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(1, 0, 0, 0), result.out);
    EXPECT_EQ("blue", volume_.Run({"get", object, "color"}).out);
    const std::vector<std::string> names = NamesIn(volume_.path() + "/@eaDir");
    ASSERT_EQ(1U, names.size());
    EXPECT_THAT(names[0], ::testing::EndsWith("@MavoEAStream"));
    EXPECT_EQ(Counts(0, 1, 0, 0), volume_.Run({"upgrade", object}).out);
}

// ---- Trees --------------------------------------------------------------------------------------

TEST_P(UpgradeTest, ATreeIsConvertedWithItsDirectoriesAndWithoutWhatIsNoObject) {
    const std::string top = volume_.path() + "/top";
    const TempDir elsewhere;
    WriteFile(elsewhere / "file", {});
    AddLegacy(elsewhere / "@eaDir/file", "color", Ascii("outside"));
    fs::create_directories(top + "/sub/deep");
    // "._b" is a file like any other, for what is in it; "._d" is metadata.
    for (const char* name : {"/a", "/sub/b", "/sub/deep/c", "/sub/c:olon", "/sub/d", "/sub/._b"}) {
        WriteFile(top + name, {});
    }
    WriteFile(top + "/sub/._d", StreamImage{.attributes = {{"color", Ascii("of d")}}}.Build());
    fs::create_directory_symlink(elsewhere.path(), top + "/link");
    fs::create_symlink(elsewhere / "file", top + "/linked-file");
    for (const char* hidden : {"/@tmp", "/@sharebin", "/sub/@EADIR"}) {
        fs::create_directories(top + hidden);
        WriteFile(top + hidden + "/object", {});
        AddLegacy(top + hidden + "/@eaDir/object", "color", Ascii("hidden"));
    }
    AddLegacy(volume_.path() + "/@eaDir/top", "color", Ascii("of the top"));
    AddLegacy(top + "/@eaDir/sub", "color", Ascii("of sub"));
    AddLegacy(top + "/sub/@eaDir/b", "color", Ascii("of b"));
    AddLegacy(top + "/sub/deep/@eaDir/c", "color", Ascii("of c"));
    AddLegacy(top + "/@eaDir/linked-file", "color", Ascii("of a link"));
    AddLegacy(top + "/sub/@eaDir/c:olon", "color", Ascii("of c:olon"));

    const ToolResult result = volume_.Run({"upgrade", "-r", top});
    EXPECT_THAT(result, Succeeded());
    // Converted: top, sub, b, c, c:olon, d. With nothing: a, deep, ._b.
    EXPECT_EQ(Counts(6, 0, 3, 0), result.out);
    EXPECT_EQ("of the top", volume_.Run({"get", top, "color"}).out);
    EXPECT_EQ("of sub", volume_.Run({"get", top + "/sub", "color"}).out);
    EXPECT_EQ("of b", volume_.Run({"get", top + "/sub/b", "color"}).out);
    EXPECT_EQ("of c", volume_.Run({"get", top + "/sub/deep/c", "color"}).out);
    EXPECT_TRUE(Exists(elsewhere / "@eaDir/file/color"));
    EXPECT_TRUE(Exists(top + "/@tmp/@eaDir/object/color"));
    EXPECT_TRUE(Exists(top + "/sub/@EADIR/@eaDir/object/color"));
    EXPECT_TRUE(Exists(top + "/@eaDir/linked-file/color"));
    EXPECT_EQ("of c:olon", volume_.Run({"get", top + "/sub/c:olon", "color"}).out);
    EXPECT_EQ("of d", volume_.Run({"get", top + "/sub/d", "color"}).out);
    EXPECT_FALSE(Exists(top + "/sub/@eaDir/c:olon"));
    EXPECT_FALSE(Exists(top + "/sub/._d"));
    EXPECT_EQ(Counts(0, 6, 3, 0), volume_.Run({"upgrade", "-r", top}).out);
}

TEST_P(UpgradeTest, WithoutTheOptionADirectoryIsOneObject) {
    AddLegacy(Folder(), "color", Ascii("blue"));
    EXPECT_EQ(Counts(0, 0, 1, 0), volume_.Run({"upgrade", volume_.path()}).out);
    EXPECT_TRUE(Exists(Folder() + "/color"));
    EXPECT_EQ(Counts(1, 0, 1, 0), volume_.Run({"upgrade", "-r", volume_.path()}).out);
}

TEST_P(UpgradeTest, ATreeGoesOnAfterFailuresAndListsThemAtTheEnd) {
    const std::string top = volume_.path() + "/top";
    fs::create_directory(top);
    for (const char* name : {"/1 bad", "/2 good", "/3 bad", "/4 good"}) {
        WriteFile(top + name, {});
        AddLegacy(top + "/@eaDir" + name, "color", Ascii("blue"));
        if (std::string(name).ends_with("bad")) {
            fs::create_directory(top + "/@eaDir" + name + "/directory");
        }
    }
    const std::string missing = volume_.path() + "/missing";
    const ToolResult result = volume_.Run({"--json", "upgrade", "-r", missing, top});
    EXPECT_EQ(2, result.status);
    const auto json = result.json();
    EXPECT_EQ("upgrading", json["task"]);
    EXPECT_EQ(2, json["done"]);
    EXPECT_EQ(0, json["current"]);
    EXPECT_EQ(1, json["nothing"]);
    EXPECT_EQ(3, json["failed"]);
    ASSERT_EQ(3U, json["failures"].size());
    EXPECT_EQ(missing, json["failures"][0]["path"]);
    EXPECT_EQ(top + "/1 bad", json["failures"][1]["path"]);
    EXPECT_EQ(top + "/3 bad", json["failures"][2]["path"]);
    std::string lines;
    for (const auto& failure : json["failures"]) {
        lines += "mavoea: " + failure["message"].get<std::string>() + "\n";
    }
    EXPECT_EQ(lines, result.err);
    EXPECT_EQ(1, volume_.Run({"upgrade", missing}).status);
}

TEST_P(UpgradeTest, AVolumeBelowThatDoesNotSuitIsOneFailure) {
    const std::string other = volume_.path() + "/other";
    fs::create_directories(other + "/sub");
    WriteFile(other + "/sub/file", {});
    const ToolResult result =
        volume_.Run({"--volume", other + "=appledouble", "upgrade", "-r", volume_.path()});
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(Counts(0, 0, 2, 1), result.out);
    EXPECT_EQ("mavoea: " + other +
                  ": volumes of type 0, AppleDouble, keep no EA directory; there is nothing to do "
                  "there\n",
              result.err);
}

// ---- The progress line --------------------------------------------------------------------------

// Standard error of a run whose standard error is a terminal; nothing where there are no terminals.
std::optional<std::string> OnTerminal(const std::string& arguments, int* status) {
    const int terminal = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (terminal < 0 || grantpt(terminal) != 0 || unlockpt(terminal) != 0) {
        return std::nullopt;
    }
    const std::string name = ptsname(terminal);
    const int other_side = open(name.c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (other_side < 0) return std::nullopt;
    const std::string command = Tested().Command() + " " + arguments + " >/dev/null 2>" + name;
    *status = system(command.c_str());
    // What was written is on its way yet; when the last who could write is gone, it ends with EIO.
    close(other_side);
    std::string text;
    char part[4096];
    for (ssize_t size = 0; (size = read(terminal, part, sizeof part)) > 0;) {
        text.append(part, static_cast<std::size_t>(size));
    }
    close(terminal);
    return text;
}

TEST(ProgressTest, ItIsOneLineOnATerminalAndIsGoneAtTheEnd) {
    const Volume volume(1);
    int status = -1;
    const std::optional<std::string> shown = OnTerminal(
        "--volume " + Quoted(volume.path()) + "=1 upgrade -r " + Quoted(volume.path()), &status);
    if (!shown) GTEST_SKIP() << "there are no terminals";
    const std::string& text = *shown;
    EXPECT_EQ(0, status);
    EXPECT_THAT(text, HasSubstr("\rupgrading: 0 done, " + volume.path().substr(0, 20)));
    EXPECT_TRUE(text.ends_with("\r\x1b[K")) << text;
    EXPECT_EQ(std::string::npos, text.find('\n')) << text;
}

// ---- Other volumes ------------------------------------------------------------------------------

TEST(UpgradeElsewhereTest, OnlyVolumesWithAnEaDirectoryHaveSomethingToConvert) {
    for (const int type : {0, 4, 5, 7, 8, 9, 11, 12}) {
        const Volume volume(type);
        const Bytes file = MacSidecar({{{"a", Ascii("1")}}, Pattern(32), {}}).bytes;
        WriteFile(volume.apple_double(), file);
        const ToolResult result = volume.Run({"upgrade", "-r", volume.path()});
        EXPECT_EQ(2, result.status);
        EXPECT_EQ(Counts(0, 0, 0, 1), result.out);
        EXPECT_THAT(result.err, HasSubstr("volumes of type " + std::to_string(type)));
        EXPECT_EQ(file, ReadFile(volume.apple_double()));
        EXPECT_EQ((std::vector<std::string>{"._file.txt", "file.txt"}), NamesIn(volume.path()));
    }
}

}  // namespace
}  // namespace mavoea::test

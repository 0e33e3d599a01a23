// "._" files onto objects: every layout that Macs and other programs write, on every kind of
// volume.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";

constexpr char kNoArchive[] =
    ": no AppleDouble, AppleSingle, MacBinary or BinHex file; see what it is with: file FILE";

using Entries = std::map<std::uint32_t, Bytes>;

constexpr std::uint32_t kAfpFileInfo = 14;

// What keeps entries besides Finder info and fork on volumes of that type, as it is called there.
std::string EntryPlace(int type) {
    if (type == 0 || type == 5) return "a \"._\" file";
    return type == 2 ? "neither a record nor a resource file" : "a resource file";
}

bool AnyByte(const Bytes& bytes) {
    return std::any_of(bytes.begin(), bytes.end(), [](auto byte) { return byte != 0; });
}

// The entries of an object's record and metadata file that say something.
Entries EntriesOn(const Volume& volume) {
    Entries entries;
    if (Exists(volume.finder_file())) entries = EntriesOf(ReadFile(volume.finder_file()));
    Bytes record(1000);
    const ssize_t size =
        getxattr(volume.object().c_str(), "user.netatalk.Metadata", record.data(), record.size());
    if (volume.type() == 2 && size > 0) {
        record.resize(static_cast<std::size_t>(size));
        for (const auto& [id, bytes] : EntriesOf(record)) entries[id] = bytes;
    }
    std::erase_if(entries, [](const auto& entry) { return !AnyByte(entry.second); });
    return entries;
}

// Those of a file that have a place, without the AFP bits that lock. MS-DOS and Macintosh file info
// have none anywhere.
Entries Importable(const Bytes& file) {
    Entries entries = EntriesOf(file);
    entries.erase(10);
    entries.erase(12);
    if (const auto afp = entries.find(kAfpFileInfo); afp != entries.end()) {
        constexpr std::uint32_t kNotLocking = 0xFFFF ^ 0xA1A0;
        PutU16(afp->second, 2, U16At(afp->second, 2) & kNotLocking);
    }
    std::erase_if(entries, [](const auto& entry) { return !AnyByte(entry.second); });
    return entries;
}

// A file with the three kinds of things in it, beside a volume's object.
class ImportTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        const int type = GetParam();
        if (type != 0 && type != 5) MAVOEA_SKIP_UNLESS_ROOT();
        if (type == 2) MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume_.path());
    }

    std::string source() const { return sources_ / "source.bin"; }

    ToolResult Import(const Bytes& bytes) const {
        WriteFile(source(), bytes);
        return volume_.Run({"import", source(), volume_.object()});
    }

    std::string NotTakenOver(const std::string& item, const std::string& reason) const {
        return "mavoea: " + volume_.object() + ": " + item + " was not taken over: " + reason +
               "\n";
    }

    // All of the contents are on the object, and nothing else.
    void ExpectOnObject(const MacContents& contents, const Bytes& fork) const {
        std::string names;
        for (const auto& [name, value] : contents.attributes) {
            EXPECT_EQ(value, volume_.Get(name).bytes()) << name;
            names += name + "\n";
        }
        if (AnyByte(contents.finder_info)) {
            EXPECT_EQ(contents.finder_info, volume_.Get(kFinderInfo).bytes());
            names += kFinderInfo + "\n";
        } else {
            EXPECT_EQ(1, volume_.Get(kFinderInfo).status);
        }
        if (!fork.empty()) {
            EXPECT_EQ(fork, volume_.Get(kFork).bytes());
            names += kFork + "\n";
        } else {
            EXPECT_EQ(1, volume_.Get(kFork).status);
        }
        EXPECT_EQ(names, volume_.List().out);
    }

    Volume volume_{GetParam()};
    TempDir sources_;
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, ImportTest,
                         ::testing::ValuesIn(Types({0, 1, 2, 3, 5, 6, 10})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(ImportTest, EveryLayoutIsTakenOverWhole) {
    for (const MacFile& file : AllMacFiles()) {
        SCOPED_TRACE(file.layout);
        const Volume fresh(GetParam());
        WriteFile(source(), file.bytes);
        const Entries all = EntriesOf(file.bytes);
        const int status = all.contains(10) || all.contains(12) ? 2 : 0;
        const ToolResult result = fresh.Run({"import", source(), fresh.object()});
        EXPECT_EQ(status, result.status) << result.err;
        EXPECT_EQ(file.bytes, ReadFile(source()));
        EXPECT_EQ(Importable(file.bytes), EntriesOn(fresh));
        for (const auto& [name, value] : file.contents.attributes) {
            EXPECT_EQ(value, fresh.Get(name).bytes()) << name;
        }
        EXPECT_EQ(file.ForkInUse(), fresh.Get(kFork).bytes());
        EXPECT_EQ(file.ForkInUse().empty() ? 1 : 0, fresh.Get(kFork).status);
        if (AnyByte(file.contents.finder_info)) {
            EXPECT_EQ(file.contents.finder_info, fresh.Get(kFinderInfo).bytes());
        }
        for (const std::string& path : {fresh.attribute_file(), fresh.finder_file()}) {
            if (!Exists(path)) continue;
            EXPECT_EQ(0, RunTool({"dump", path}).status) << path;
        }
        // A second time there is nothing that would change.
        const std::vector<std::string> paths = {fresh.attribute_file(), fresh.finder_file()};
        std::vector<Bytes> before;
        for (const std::string& path : paths) {
            before.push_back(Exists(path) ? ReadFile(path) : Bytes());
        }
        EXPECT_EQ(status, fresh.Run({"import", source(), fresh.object()}).status);
        EXPECT_EQ(file.ForkInUse(), fresh.Get(kFork).bytes());
        for (std::size_t i = 0; i < paths.size(); ++i) {
            EXPECT_EQ(before[i], Exists(paths[i]) ? ReadFile(paths[i]) : Bytes()) << paths[i];
        }
    }
}

TEST_P(ImportTest, FilesThatOthersWroteAreTakenOverWholeAndOthersRefused) {
    const std::vector<SampleFile> samples = SampleFiles();
    if (samples.empty()) GTEST_SKIP() << kNoSampleFiles;
    int taken_over = 0;
    for (const SampleFile& sample : samples) {
        SCOPED_TRACE(sample.name);
        const Volume fresh(GetParam());
        WriteFile(source(), sample.bytes);
        const ToolResult result = fresh.Run({"import", source(), fresh.object()});
        if (!sample.contents) {
            // The object has other data than the AppleSingle files among them.
            const bool single = sample.bytes.size() > 4 && U32At(sample.bytes, 0) == 0x00051600;
            EXPECT_THAT(result,
                        Failed(2, single ? fresh.object() +
                                               ": its data is not that of the AppleSingle file; "
                                               "replace it with: mavoea import --data, or name "
                                               "another path"
                                         : source() + kNoArchive));
            EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(fresh.path()));
            continue;
        }
        ++taken_over;
        EXPECT_EQ(0, result.status) << result.err;
        for (const auto& [name, value] : sample.contents->attributes) {
            EXPECT_EQ(value, fresh.Get(name).bytes()) << name;
        }
        if (AnyByte(sample.contents->finder_info)) {
            EXPECT_EQ(sample.contents->finder_info, fresh.Get(kFinderInfo).bytes());
        }
        const MacFile file{sample.name, sample.bytes, *sample.contents};
        EXPECT_EQ(file.ForkInUse(), fresh.Get(kFork).bytes());
    }
    EXPECT_LT(10, taken_over);
}

TEST_P(ImportTest, WhatTheFileDoesNotHoldStaysAndValuesReplaceWhole) {
    ASSERT_THAT(volume_.Set("stays", Ascii("as it is")), Succeeded());
    ASSERT_THAT(volume_.Set("replaced", Pattern(500, 1)), Succeeded());
    ASSERT_THAT(volume_.Set(kFinderInfo, Pattern(32, 2)), Succeeded());
    ASSERT_THAT(volume_.Set(kFork, Pattern(900, 3)), Succeeded());
    MacContents contents{{{"replaced", Ascii("short")}}, Bytes(32), {}};
    EXPECT_THAT(Import(MacSidecarWithBlankFork(contents).bytes), Succeeded());
    contents = {{{"stays", Ascii("as it is")}, {"replaced", Ascii("short")}},
                Pattern(32, 2),
                Pattern(900, 3)};
    for (const auto& [name, value] : contents.attributes) {
        EXPECT_EQ(value, volume_.Get(name).bytes());
    }
    EXPECT_EQ(contents.finder_info, volume_.Get(kFinderInfo).bytes());
    EXPECT_EQ(contents.fork, volume_.Get(kFork).bytes());

    EXPECT_THAT(Import(ClassicFile(Pattern(32, 7), Pattern(10, 8)).bytes), Succeeded());
    EXPECT_EQ("stays\nreplaced\n" + kFinderInfo + "\n" + kFork + "\n", volume_.List().out);
    EXPECT_EQ("short", volume_.Get("replaced").out);
    EXPECT_EQ(Pattern(32, 7), volume_.Get(kFinderInfo).bytes());
    EXPECT_EQ(Pattern(10, 8), volume_.Get(kFork).bytes());
}

TEST_P(ImportTest, WhatWasTakenOverIsSaid) {
    const std::string object = volume_.object();
    EXPECT_EQ(
        object + ": 2 attributes, Finder info, resource fork of 30 bytes\n",
        Import(MacSidecar({{{"a", {}}, {"b", Pattern(4)}}, Pattern(32, 1), Pattern(30)}).bytes)
            .out);
    EXPECT_EQ(object + ": nothing to take over\n", Import(ClassicFile(Bytes(32), {}).bytes).out);
    WriteFile(source(), MacSidecar({{{"a", Ascii("1")}}, Pattern(32, 1), Pattern(30)}).bytes);
    const auto json = volume_.Run({"--json", "import", source(), object}).json();
    EXPECT_EQ(object, json["path"]);
    EXPECT_EQ(source(), json["appleDouble"]);
    EXPECT_EQ("a", json["attributes"][0]["name"]);
    EXPECT_EQ(1, json["attributes"][0]["size"]);
    EXPECT_EQ(true, json["finderInfo"]);
    EXPECT_EQ(30, json["resourceFork"]);
    EXPECT_EQ(nlohmann::json::array(), json["notTakenOver"]);
    EXPECT_EQ(nlohmann::json::array(), json["failures"]);
}

TEST_P(ImportTest, EntriesThatHaveNoPlaceAreNamed) {
    const std::string why = EntryPlace(GetParam()) + " has no place for it";
    const ToolResult result = Import(ThirteenEntryFile(Pattern(32, 1), Pattern(5)).bytes);
    EXPECT_EQ(2, result.status);
    EXPECT_EQ("", result.out);
    EXPECT_EQ(NotTakenOver("Macintosh file info", why) + NotTakenOver("MS-DOS file info", why),
              result.err);
    const ToolResult again = volume_.Run({"--json", "import", source(), volume_.object()});
    EXPECT_EQ(2, again.status);
    const auto json = again.json();
    ASSERT_EQ(2U, json["notTakenOver"].size());
    EXPECT_EQ("Macintosh file info", json["notTakenOver"][0]["name"]);
    EXPECT_EQ("MS-DOS file info", json["notTakenOver"][1]["name"]);
    EXPECT_EQ(why, json["notTakenOver"][1]["reason"]);
    EXPECT_EQ(2U, json["failures"].size());
}

TEST_P(ImportTest, EntriesComeToWhatTheObjectHasAndTakeNoneOfItAway) {
    ASSERT_THAT(volume_.Set(kFinderInfo, Pattern(32, 2)), Succeeded());
    ASSERT_THAT(volume_.Set(kFork, Pattern(900, 3)), Succeeded());
    const Bytes file = NetatalkFile(Bytes(32), {}).bytes;
    const ToolResult result = Import(file);
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(volume_.object() + ": real name, comment, file dates, AFP directory id\n",
              result.out);
    EXPECT_EQ(Importable(file), EntriesOn(volume_));
    ExpectOnObject({{}, Pattern(32, 2), {}}, Pattern(900, 3));
    EXPECT_EQ("0", volume_.Get("mavoea.locked").out);
}

TEST_P(ImportTest, BesideAttributesEntriesHaveAPlaceInAnEaDirectoryOnly) {
    ASSERT_THAT(volume_.Set("kept", Ascii("value")), Succeeded());
    const Bytes file = NetatalkFile(Pattern(32, 1), Pattern(5)).bytes;
    const ToolResult result = Import(file);
    if (GetParam() == 0 || GetParam() == 5) {
        EXPECT_EQ(2, result.status);
        std::string err;
        for (const char* name : {"real name", "comment", "file dates", "AFP directory id"}) {
            err += NotTakenOver(name, "a \"._\" file with attributes has no place for it");
        }
        EXPECT_EQ(err, result.err);
        EXPECT_EQ(Entries(), EntriesOn(volume_));
    } else {
        EXPECT_THAT(result, Succeeded());
        EXPECT_EQ(Importable(file), EntriesOn(volume_));
    }
    ExpectOnObject({{{"kept", Ascii("value")}}, Pattern(32, 1), {}}, Pattern(5));
}

TEST_P(ImportTest, EntriesThatTheObjectWouldLoseKeepTheOthersFromIt) {
    const Bytes own = ThirteenEntryFile(Pattern(32, 1), Pattern(5)).bytes;
    ASSERT_THAT(volume_.Set(kFork, Ascii("make the directory")), Succeeded());
    WriteFile(volume_.finder_file(), own);
    const ToolResult result = Import(NetatalkFile(Bytes(32), {}).bytes);
    EXPECT_EQ(2, result.status);
    const std::string why = "writing its metadata anew would lose its Macintosh file info";
    std::string err;
    for (const char* name : {"real name", "comment", "file dates", "AFP directory id"}) {
        err += NotTakenOver(name, why);
    }
    EXPECT_EQ(err, result.err);
    EXPECT_EQ(own, ReadFile(volume_.finder_file()));
}

TEST_P(ImportTest, TheLockIsNoAttributeAndAttributesOfTheOtherTwoNamesAreThose) {
    const ToolResult result = Import(
        MacSidecar(
            {{{kFinderInfo, Pattern(32, 4)}, {kFork, Ascii("fork")}, {"mavoea.locked", Ascii("1")}},
             Bytes(32),
             {}})
            .bytes);
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(NotTakenOver("attribute \"mavoea.locked\"", "its name means something else"),
              result.err);
    ExpectOnObject({{}, Pattern(32, 4), {}}, Ascii("fork"));
    EXPECT_EQ("0", volume_.Get("mavoea.locked").out);
}

// ---- Files that are refused ---------------------------------------------------------------------

class RefusedTest : public ImportTest {
 protected:
    void SetUp() override {
        ImportTest::SetUp();
        if (IsSkipped()) return;
        ASSERT_THAT(volume_.Set("kept", Ascii("value")), Succeeded());
    }

    void ExpectRefused(const Bytes& bytes, const std::string& cause) const {
        const Bytes before = ReadFile(volume_.attribute_file());
        EXPECT_THAT(Import(bytes), Failed(2, source() + ": " + cause));
        EXPECT_EQ(before, ReadFile(volume_.attribute_file()));
        EXPECT_EQ("kept\n", volume_.List().out);
    }
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, RefusedTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(RefusedTest, WhatIsNoAppleDoubleFileChangesNothing) {
    const std::string cause = std::string(kNoArchive).substr(2);
    ExpectRefused({}, cause);
    ExpectRefused(Ascii("text"), cause);
    ExpectRefused(Hex("00 05 16 07 00 02 00 00"),
                  "no AppleDouble file; look at it with: mavoea dump FILE");
    ExpectRefused(Hex("00 05 16 00 00 02 00 00 00*16 00 01"),
                  "damaged: its entries pass the end of the file; get it once more from where it "
                  "came from");
    Bytes version1 = ClassicFile(Pattern(32), {}).bytes;
    version1[5] = 1;
    ExpectRefused(version1,
                  "its AppleDouble version is 0x00010000, not 0x00020000; look at it with: mavoea "
                  "dump FILE");
}

TEST_P(RefusedTest, EveryTruncationChangesNothing) {
    const Bytes whole =
        MacSidecar({{{"a", Ascii("one")}, {"b", Pattern(300)}}, Pattern(32, 1), Pattern(50)}).bytes;
    for (std::size_t size = 0; size < whole.size();
         size += (size < 600 ? 37 : 501) * SeriesStep()) {
        SCOPED_TRACE(size);
        const ToolResult result =
            Import(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)));
        EXPECT_EQ(2, result.status);
        EXPECT_EQ("", result.out);
        EXPECT_EQ("kept\n", volume_.List().out);
    }
}

TEST_P(RefusedTest, WhatLiesOutsideTheFileIsNamed) {
    const std::string look = " the end of the file; look at it with: mavoea dump FILE";
    StreamImage image{.attributes = {{"a", Ascii("one")}}, .fork = Ascii("fork")};
    Bytes file = image.Build();
    PutU32(file, image.RecordAt(0), 0xFFFFFFF0);
    ExpectRefused(file, "damaged: attribute \"a\" passes" + look);
    file = image.Build();
    PutU32(file, kForkLengthAt, 5);
    ExpectRefused(file, "damaged: its resource fork passes" + look);
    file = ClassicFile(Pattern(32), {}).bytes;
    PutU32(file, 30, 51);
    ExpectRefused(file, "damaged: its Finder info passes" + look);
    file = ClassicFile(Pattern(32), {}).bytes;
    PutU16(file, 24, 0xFFFF);
    ExpectRefused(file, "damaged: its descriptors pass" + look);
}

TEST_P(RefusedTest, ValuesThatShareBytesTakeNoMoreMemoryThanTheFile) {
    StreamImage image;
    for (int i = 0; i < 300; ++i) image.attributes.push_back({"a" + std::to_string(i), {}});
    image.fork = Pattern(1 << 20);
    Bytes file = image.Build();
    for (std::size_t i = 0; i < 300; ++i) {
        PutU32(file, image.RecordAt(i), image.TotalSize());
        PutU32(file, image.RecordAt(i) + 4, 1 << 20);
    }
    WriteFile(source(), file);
    const ToolResult result =
        volume_.Run({"import", source(), volume_.object()}, {}, {.memory = std::size_t{256} << 20});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("damaged: attribute"));
}

TEST_P(RefusedTest, PathsThatAreWrongAreTold) {
    const std::string missing = volume_.path() + "/missing";
    EXPECT_THAT(volume_.Run({"import", missing, volume_.object()}),
                Failed(1, missing + ": No such file or directory; check the path"));
    WriteFile(source(), ClassicFile(Pattern(32), {}).bytes);
    EXPECT_THAT(volume_.Run({"import", source(), missing}),
                Failed(1, missing + ": No such file or directory; check the path"));
    EXPECT_EQ(2, volume_.Run({"import", volume_.path(), volume_.object()}).status);
    EXPECT_EQ("kept\n", volume_.List().out);
}

// ---- Volumes of their own kinds -----------------------------------------------------------------

TEST(ImportElsewhereTest, AnObjectsOwnAppleDoubleFileIsImportedWhereItIsInUse) {
    const Volume volume(0);
    const MacFile file = MacSidecar({{{"a", Ascii("1")}}, Pattern(32, 1), Ascii("fork")});
    WriteFile(volume.apple_double(), file.bytes);
    EXPECT_THAT(volume.Run({"import", volume.apple_double(), volume.object()}), Succeeded());
    EXPECT_EQ(file.bytes, ReadFile(volume.apple_double()));
}

TEST(ImportElsewhereTest, AnObjectsOwnAppleDoubleFileIsAdoptedOnAnEaDirectoryVolume) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const Volume volume(1);
    WriteFile(volume.apple_double(),
              MacSidecar({{{"a", Ascii("1")}}, Pattern(32, 1), Ascii("fork")}).bytes);
    const ToolResult result = volume.Run({"import", volume.apple_double(), volume.object()});
    EXPECT_EQ(0, result.status);
    EXPECT_EQ("mavoea: note: " + volume.object() + ": what an earlier version kept in " +
                  volume.apple_double() + " is in the current layout now\n",
              result.err);
    EXPECT_FALSE(Exists(volume.apple_double()));
    EXPECT_EQ((MacContents{{{"a", Ascii("1")}}, Bytes(32), {}}),
              ReadMacFile(ReadFile(volume.stream())));
    EXPECT_EQ((MacContents{{}, Pattern(32, 1), Ascii("fork")}),
              ReadMacFile(ReadFile(volume.resource())));
    EXPECT_EQ("1", volume.Get("a").out);
    EXPECT_EQ(Pattern(32, 1), volume.Get(kFinderInfo).bytes());
    EXPECT_EQ("fork", volume.Get(kFork).out);
}

TEST(ImportElsewhereTest, WhatAVolumeOfAttributesCannotKeepDoesNotStopTheRest) {
    const Volume volume(7);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    const std::string source = volume.path() + "/source";
    WriteFile(
        source,
        MacSidecar({{{"com.apple.quarantine", Ascii("q")}, {"user.a", Ascii("1")}}, Bytes(32), {}})
            .bytes);
    const ToolResult result = volume.Run({"import", source, volume.object()});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err,
                HasSubstr("mavoea: " + volume.object() +
                          ": \"com.apple.quarantine\" was not taken over: " + volume.object()));
    EXPECT_EQ("1", volume.Get("user.a").out);
}

TEST(ImportElsewhereTest, AVolumeWithoutMetadataIsToldSo) {
    const Volume volume(4);
    const std::string source = volume.path() + "/source";
    WriteFile(source, ClassicFile(Pattern(32), {}).bytes);
    const ToolResult result = volume.Run({"import", source, volume.object()});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("volumes of type 4 keep no metadata"));
}

}  // namespace
}  // namespace mavoea::test

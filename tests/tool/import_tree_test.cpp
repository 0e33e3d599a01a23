// "._" files that Macs left in a tree, and in what was unpacked from their archives: onto the
// objects that they belong to, on every kind of volume.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <optional>

#include "tests/tool/kills.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;

const std::string kRecordName = "user.org.netatalk.Metadata";
const std::string kAfpInfoName = "user.DosStream.AFP_AfpInfo:$DATA";

std::string Counts(int imported, int in_place, int failed) {
    return std::to_string(imported) + " imported, " + std::to_string(in_place) +
           " where they belong, " + std::to_string(failed) + " failed\n";
}

// How a type of volume keeps things, for these tests.
struct Kind {
    std::string type;
    bool in_place = false;         // "._" files beside objects are where it keeps metadata
    bool fork_beside = false;      // the program's own "._" file has the fork
    bool keeps_everything = true;  // or attributes of users only
};
void PrintTo(const Kind& kind, std::ostream* out) { *out << kind.type; }

const Kind kAppleDoubleKind = {.type = "appledouble", .in_place = true};
const Kind kEaDirKind = {.type = "eadir"};
const Kind kFileEaKind = {.type = "fileea"};
const Kind kXattrKind = {.type = "xattr", .keeps_everything = false};
const Kind kSambaKind = {.type = "samba", .fork_beside = true};
const Kind kSambaStreamKind = {.type = "samba-stream", .fork_beside = true};
const Kind kSambaAllKind = {.type = "samba-all-streams"};
const Kind kNetatalkKind = {.type = "netatalk", .fork_beside = true};
const Kind kNetatalkSambaKind = {.type = "netatalk-samba", .fork_beside = true};
const Kind kLinuxKind = {.type = "linux"};

std::vector<Kind> AllKinds() {
    if (Tested().emulated()) return {kAppleDoubleKind, kEaDirKind};
    return {kAppleDoubleKind, kEaDirKind,    kFileEaKind,   kXattrKind,         kSambaKind,
            kSambaStreamKind, kSambaAllKind, kNetatalkKind, kNetatalkSambaKind, kLinuxKind};
}
// Those on which a "._" file beside its object is to be imported.
std::vector<Kind> ImportingKinds() {
    std::vector<Kind> kinds = AllKinds();
    std::erase_if(kinds, [](const Kind& kind) { return kind.in_place; });
    return kinds;
}

std::string NameOf(const Kind& kind) {
    std::string name = kind.type;
    std::replace(name.begin(), name.end(), '-', '_');
    return name;
}

class ImportTree : public ::testing::Test {
 protected:
    explicit ImportTree(const Kind& kind) : kind_(kind) {}

    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
    }

    std::string At(const std::string& path) const { return dir_ / path; }

    ToolResult Run(Arguments arguments) const {
        arguments.insert(arguments.begin(), {"--volume", dir_.path() + '=' + kind_.type});
        return RunTool(arguments);
    }
    Arguments ImportArguments(const Arguments& options = {}) const {
        Arguments arguments = {"--volume", dir_.path() + '=' + kind_.type, "import", "-r"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        arguments.push_back(dir_.path());
        return arguments;
    }
    ToolResult Import(const Arguments& options = {}) const {
        return RunTool(ImportArguments(options));
    }

    void Make(const std::string& path) const {
        fs::create_directories(fs::path(At(path)).parent_path());
        WriteFile(At(path), Ascii("data of " + path));
    }

    // What a Mac would write of that colour, as far as the volume can keep it.
    Bytes MacFileOf(const std::string& colour) const {
        MacContents contents = {.attributes = {{Colour(), Ascii(colour)}}};
        if (kind_.keeps_everything) {
            contents.finder_info = FinderInfoOf(colour);
            contents.fork = Ascii("fork of " + colour);
        }
        return MacSidecar(contents).bytes;
    }
    static Bytes FinderInfoOf(const std::string& colour) {
        return Pattern(32, static_cast<std::uint8_t>(colour[0]));
    }
    void Put(const std::string& path, const std::string& colour) const {
        fs::create_directories(fs::path(At(path)).parent_path());
        WriteFile(At(path), MacFileOf(colour));
    }

    std::string Get(const std::string& path, const std::string& name) const {
        return Run({"get", At(path), name}).out;
    }
    void ExpectColour(const std::string& path, const std::string& colour) const {
        EXPECT_EQ(colour, Get(path, Colour())) << path;
        if (!kind_.keeps_everything) return;
        EXPECT_EQ(FinderInfoOf(colour), Ascii(Get(path, kFinderInfoName))) << path;
        EXPECT_EQ("fork of " + colour, Get(path, kForkName)) << path;
    }

    // Whether what is left at the path of a "._" file is what it should be: nothing, or the file of
    // the program that keeps the fork there.
    void ExpectTaken(const std::string& path, const std::string& colour) const {
        if (!kind_.fork_beside) {
            EXPECT_FALSE(Exists(At(path))) << path;
        } else {
            EXPECT_EQ(OwnForkFile(Ascii("fork of " + colour)), ReadFile(At(path))) << path;
        }
    }

    // A "._" file as Samba and netatalk have it.
    static Bytes OwnForkFile(const Bytes& fork) {
        Bytes size(4);
        PutU32(size, 0, fork.size());
        return Hex("00 05 16 07  00 02 00 00 'Netatalk        ' 00 02"
                   "00 00 00 02  00 00 00 52") +
               size + Hex("00 00 00 09  00 00 00 32  00 00 00 20") + Repeat(0, 32) + fork;
    }

    const Kind kind_;
    const TempDir dir_;
};

class ImportTreeTest : public ImportTree, public ::testing::WithParamInterface<Kind> {
 protected:
    ImportTreeTest() : ImportTree(GetParam()) {}
};
INSTANTIATE_TEST_SUITE_P(Kinds, ImportTreeTest, ::testing::ValuesIn(AllKinds()),
                         [](const auto& tested) { return NameOf(tested.param); });

class BesideTest : public ImportTreeTest {};
INSTANTIATE_TEST_SUITE_P(Kinds, BesideTest, ::testing::ValuesIn(ImportingKinds()),
                         [](const auto& tested) { return NameOf(tested.param); });

// ---- What arrives -------------------------------------------------------------------------------

TEST_P(BesideTest, EachFileGoesOntoTheObjectBesideIt) {
    Make("one");
    Make("sub/two");
    Make("sub/deep/three");
    Make("plain");
    Put("._one", "red");
    Put("sub/._two", "green");
    Put("sub/deep/._three", "blue");
    const ToolResult result = Import();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(3, 0, 0), result.out);
    ExpectColour("one", "red");
    ExpectColour("sub/two", "green");
    ExpectColour("sub/deep/three", "blue");
    ExpectTaken("._one", "red");
    ExpectTaken("sub/._two", "green");
    ExpectTaken("sub/deep/._three", "blue");
    EXPECT_EQ(Ascii("data of sub/two"), ReadFile(At("sub/two")));
    EXPECT_EQ("", Run({"list", At("plain")}).out);
    EXPECT_EQ(Counts(0, kind_.fork_beside ? 3 : 0, 0), Import().out);
}

TEST_P(BesideTest, DirectoriesAreObjectsToo) {
    Make("sub/file");
    WriteFile(At("._sub"), MacSidecar({.attributes = {{Colour(), Ascii("red")}}}).bytes);
    EXPECT_THAT(Import(), Succeeded());
    EXPECT_EQ("red", Get("sub", Colour()));
    EXPECT_FALSE(Exists(At("._sub")));
}

// An archive's tree as it is unpacked: what is beside "__MACOSX", and its mirror in it.
TEST_P(ImportTreeTest, WhatAnArchiveBroughtGoesOntoWhatIsBesideItsFolder) {
    Make("top");
    Make("sub/inner/file");
    Put("__MACOSX/._top", "red");
    Put("__MACOSX/sub/inner/._file", "green");
    WriteFile(At("__MACOSX/sub/._inner"),
              MacSidecar({.attributes = {{Colour(), Ascii("blue")}}}).bytes);
    // Another one that was unpacked in it.
    Make("sub/more/other/file");
    Put("sub/more/__MACOSX/other/._file", "white");
    const ToolResult result = Import();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(4, 0, 0), result.out);
    ExpectColour("top", "red");
    ExpectColour("sub/inner/file", "green");
    EXPECT_EQ("blue", Get("sub/inner", Colour()));
    ExpectColour("sub/more/other/file", "white");
    EXPECT_FALSE(Exists(At("__MACOSX")));
    EXPECT_FALSE(Exists(At("sub/more/__MACOSX")));
    EXPECT_THAT(Import().out, AllOf(HasSubstr("0 imported, "), HasSubstr(", 0 failed\n")));
}

TEST_P(ImportTreeTest, WhatIsThereAndNotInTheFileStaysAndTheRestIsReplaced) {
    Make("file");
    ASSERT_THAT(Run({"set", At("file"), "user.own", "mine"}), Succeeded());
    ASSERT_THAT(Run({"set", At("file"), Colour(), "white"}), Succeeded());
    Put("__MACOSX/._file", "red");
    EXPECT_THAT(Import(), Succeeded());
    ExpectColour("file", "red");
    EXPECT_EQ("mine", Get("file", "user.own"));
}

TEST_P(ImportTreeTest, MoreFilesThanAreRemovedAtATimeAllArrive) {
    constexpr int kCount = 300;
    for (int i = 0; i < kCount; ++i) {
        const std::string name = "file" + std::to_string(i);
        Make("sub" + std::to_string(i) + "/" + name);
        Put("__MACOSX/sub" + std::to_string(i) + "/._" + name, std::to_string(i));
    }
    const ToolResult result = Import();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(kCount, 0, 0), result.out);
    EXPECT_FALSE(Exists(At("__MACOSX")));
    for (const int i : {0, 255, 256, 299}) {
        ExpectColour("sub" + std::to_string(i) + "/file" + std::to_string(i), std::to_string(i));
    }
}

// ---- Where such files are in use ----------------------------------------------------------------

class InUseTest : public ImportTree {
 protected:
    InUseTest() : ImportTree(kAppleDoubleKind) {}
};

TEST_F(InUseTest, WhatLiesBesideItsObjectIsLeftAlone) {
    Make("file");
    Make("sub/file");
    Put("._file", "red");
    Put("sub/._file", "green");
    const auto before = Everything(dir_.path());
    const ToolResult result = Import();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(0, 2, 0), result.out);
    EXPECT_THAT(Differences(before, Everything(dir_.path())), IsEmpty());
}

class ForkBesideTest : public ImportTreeTest {};
INSTANTIATE_TEST_SUITE_P(Kinds, ForkBesideTest,
                         ::testing::ValuesIn(Thinned(std::vector<Kind>{
                             kSambaKind, kSambaStreamKind, kNetatalkKind, kNetatalkSambaKind})),
                         [](const auto& tested) { return NameOf(tested.param); });

TEST_P(ForkBesideTest, TheProgramsOwnFileIsLeftAlone) {
    Make("file");
    WriteFile(At("._file"), OwnForkFile(Ascii("fork")));
    const struct stat before = StatusOf(At("._file"));
    const ToolResult result = Import();
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(Counts(0, 1, 0), result.out);
    EXPECT_EQ(before.st_ino, StatusOf(At("._file")).st_ino);
    EXPECT_EQ(OwnForkFile(Ascii("fork")), ReadFile(At("._file")));
}

TEST_P(ForkBesideTest, AForkAloneInAMacsFileIsPutIntoTheProgramsOwn) {
    Make("file");
    WriteFile(At("._file"), MacSidecar({.fork = Ascii("fork")}).bytes);
    EXPECT_EQ(Counts(1, 0, 0), Import().out);
    EXPECT_EQ(OwnForkFile(Ascii("fork")), ReadFile(At("._file")));
}

TEST_P(ForkBesideTest, AFileWithoutAForkGoes) {
    Make("file");
    WriteFile(At("._file"), MacSidecarWithBlankFork({.attributes = {{Colour(), Ascii("red")}},
                                                     .finder_info = FinderInfoOf("red")})
                                .bytes);
    EXPECT_THAT(Import(), Succeeded());
    EXPECT_EQ("red", Get("file", Colour()));
    EXPECT_EQ(FinderInfoOf("red"), Ascii(Get("file", kFinderInfoName)));
    EXPECT_FALSE(Exists(At("._file")));
}

TEST_P(ForkBesideTest, WhatIsToStayIsNotConverted) {
    Make("file");
    Put("._file", "red");
    EXPECT_THAT(Import({"--keep"}),
                AllOf(::testing::Field(&ToolResult::status, 2),
                      ::testing::Field(&ToolResult::err, HasSubstr("so it cannot stay as it is"))));
    EXPECT_EQ(MacFileOf("red"), ReadFile(At("._file")));
}

TEST_P(ForkBesideTest, AnArchivesForkJoinsWhatTheProgramHas) {
    Make("file");
    WriteFile(At("._file"), OwnForkFile(Ascii("fork of white")));
    WriteFile(At("._other"), OwnForkFile(Ascii("another fork")));
    Make("other");
    Put("__MACOSX/._file", "red");
    fs::create_directories(At("__MACOSX"));
    WriteFile(At("__MACOSX/._other"), MacSidecar({.attributes = {{Colour(), Ascii("red")}}}).bytes);
    EXPECT_EQ(Counts(2, 2, 0), Import().out);
    ExpectColour("file", "red");
    EXPECT_EQ(OwnForkFile(Ascii("fork of red")), ReadFile(At("._file")));
    EXPECT_EQ("red", Get("other", Colour()));
    EXPECT_EQ(OwnForkFile(Ascii("another fork")), ReadFile(At("._other")));
}

// The bytes that smbd reads.
class SambaStreamTest : public ImportTree {
 protected:
    SambaStreamTest() : ImportTree(kSambaStreamKind) {}
};

TEST_F(SambaStreamTest, AttributesAreWrittenAsSambaHasThem) {
    Make("file");
    Put("._file", "red");
    EXPECT_THAT(Import(), Succeeded());
    EXPECT_EQ(Hex("'red' 00"), FileAttribute(At("file"), "user.DosStream.user.colour:$DATA"));
    EXPECT_EQ(Hex("'AFP' 00  00 00 01 00  00 00 00 00  80 00 00 00") + FinderInfoOf("red") +
                  Repeat(0, 12) + Bytes{0},
              FileAttribute(At("file"), kAfpInfoName));
    EXPECT_EQ(OwnForkFile(Ascii("fork of red")), ReadFile(At("._file")));
}

class EarlierLayoutTest : public ImportTreeTest {
 protected:
    void Fill(const std::string& root) const {
        MakeDir(root);
        for (const std::string name : {"only", "folder", "both", "current"}) {
            WriteFile(root + '/' + name, Ascii("data"));
        }
        PutAppleDouble(root + "/only", MacFileOf("red"));
        PutLegacy(root + "/folder", "color", Ascii("blue"));
        PutLegacy(
            root + "/folder", "MAVO:Resource",
            ResourceFileOf({{kFinderInfoEntry, Pattern(32, 1)}, {kForkEntry, Ascii("fork")}}));
        PutAppleDouble(root + "/folder", MacFileOf("green"));
        PutLegacy(root + "/both", "color", Ascii("blue"));
        PutAppleDouble(root + "/both", MacFileOf("green"));
        PutStream(root + "/current", AppleDoubleOfColour("white"));
    }
};
INSTANTIATE_TEST_SUITE_P(Kinds, EarlierLayoutTest,
                         ::testing::ValuesIn(std::vector<Kind>{kEaDirKind, kFileEaKind}),
                         [](const auto& tested) { return NameOf(tested.param); });

TEST_P(EarlierLayoutTest, TheResultIsThatOfAnUpgrade) {
    const std::string upgraded = At("upgraded");
    MakeDir(upgraded);
    WriteFile(upgraded + "/file", Ascii("data"));
    PutAppleDouble(upgraded + "/file", MacFileOf("red"));
    fs::copy(upgraded, At("imported"), fs::copy_options::recursive);
    EXPECT_THAT(Run({"upgrade", "-r", upgraded}), Succeeded());
    EXPECT_THAT(Run({"import", "-r", At("imported")}), Succeeded());
    EXPECT_THAT(Differences(Everything(upgraded), Everything(At("imported"))), IsEmpty());
    EXPECT_FALSE(Exists(At("imported/._file")));
    ExpectColour("imported/file", "red");
}

TEST_P(EarlierLayoutTest, WhatElseEarlierVersionsKeptComesAlong) {
    Fill(At("tree"));
    EXPECT_EQ(0, Import().status);
    ExpectColour("tree/only", "red");
    ExpectColour("tree/folder", "green");
    ExpectColour("tree/both", "green");
    EXPECT_EQ("white", Get("tree/current", Colour()));
    for (const std::string name : {"only", "folder", "both"}) {
        EXPECT_FALSE(Exists(At("tree/._" + name))) << name;
    }
}

TEST_P(EarlierLayoutTest, AFileBesideAStreamIsImportedOverIt) {
    Make("file");
    PutStream(At("file"),
              StreamImage{.attributes = {{Colour(), Ascii("white")}, {"user.own", Ascii("mine")}}}
                  .Build());
    Put("._file", "red");
    EXPECT_EQ(Counts(1, 0, 0), Import().out);
    ExpectColour("file", "red");
    EXPECT_EQ("mine", Get("file", "user.own"));
    EXPECT_FALSE(Exists(At("._file")));
}

// ---- Several files for one object ---------------------------------------------------------------

TEST_P(BesideTest, TheFileBesideTheObjectCountsThenTheInnermost) {
    Make("sub/file");
    const auto put = [&](const std::string& path, const std::string& colour,
                         const std::string& own) {
        fs::create_directories(fs::path(At(path)).parent_path());
        WriteFile(At(path), MacSidecar({.attributes = {{Colour(), Ascii(colour)},
                                                       {own, Ascii("here")},
                                                       {"user.level", Ascii(own)}}})
                                .bytes);
    };
    put("__MACOSX/sub/._file", "red", "user.outer");
    put("sub/__MACOSX/._file", "green", "user.inner");
    fs::create_directories(At("sub"));
    WriteFile(At("sub/._file"), MacFileOf("blue"));
    const ToolResult result = Import();
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(Counts(3, 0, 0), result.out);
    ExpectColour("sub/file", "blue");
    EXPECT_EQ("here", Get("sub/file", "user.outer"));
    EXPECT_EQ("here", Get("sub/file", "user.inner"));
    EXPECT_EQ("user.inner", Get("sub/file", "user.level"));
    const std::string counts = At("sub/._file") + " has, which counts: \"" + Colour() + "\"";
    EXPECT_THAT(result.err,
                HasSubstr("note: " + At("sub/file") + ": what " + At("sub/__MACOSX/._file") +
                          " has for it differs from what " + counts + '\n'));
    EXPECT_THAT(result.err, HasSubstr(At("__MACOSX/sub/._file")));
    ExpectTaken("sub/._file", "blue");
    EXPECT_FALSE(Exists(At("__MACOSX")));
    EXPECT_FALSE(Exists(At("sub/__MACOSX")));
}

// ---- Options ------------------------------------------------------------------------------------

TEST_P(ImportTreeTest, FilesStayWhereTheyAreToBeKept) {
    Make("file");
    Make("sub/file");
    Put("__MACOSX/._file", "red");
    Put("__MACOSX/sub/._file", "green");
    for (int run = 0; run < 2; ++run) {
        EXPECT_THAT(Import({"--keep"}), Succeeded());
        ExpectColour("file", "red");
        ExpectColour("sub/file", "green");
        EXPECT_EQ(MacFileOf("red"), ReadFile(At("__MACOSX/._file")));
        EXPECT_EQ(MacFileOf("green"), ReadFile(At("__MACOSX/sub/._file")));
    }
}

TEST_P(BesideTest, AFileBesideItsObjectStaysAsItIs) {
    if (kind_.fork_beside) GTEST_SKIP() << "the fork's place";
    Make("file");
    Put("._file", "red");
    for (int run = 0; run < 2; ++run) {
        EXPECT_THAT(Import({"--keep"}), Succeeded());
        ExpectColour("file", "red");
        EXPECT_EQ(MacFileOf("red"), ReadFile(At("._file")));
    }
    ASSERT_EQ(0, unlink(At("._file").c_str()));
    ExpectColour("file", "red");
}

TEST_P(ImportTreeTest, ValuesThatAreThereStayIfTheyAreToBeKept) {
    Make("file");
    Make("same");
    ASSERT_THAT(Run({"set", At("file"), Colour(), "white"}), Succeeded());
    ASSERT_THAT(Run({"set", At("same"), Colour(), "green"}), Succeeded());
    fs::create_directories(At("__MACOSX"));
    const Bytes file =
        MacSidecar({.attributes = {{Colour(), Ascii("red")}, {"user.new", Ascii("new")}}}).bytes;
    WriteFile(At("__MACOSX/._file"), file);
    Put("__MACOSX/._same", "green");
    const ToolResult result = Import({"--keep-existing"});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.out, AllOf(HasSubstr("1 imported, "), HasSubstr(", 1 failed\n")));
    EXPECT_THAT(result.err,
                HasSubstr("mavoea: " + At("__MACOSX/._file") +
                          ": it stays, for the object has other values: \"" + Colour() + "\";"));
    EXPECT_EQ("white", Get("file", Colour()));
    EXPECT_EQ("new", Get("file", "user.new"));
    EXPECT_EQ(file, ReadFile(At("__MACOSX/._file")));
    ExpectColour("same", "green");
    EXPECT_FALSE(Exists(At("__MACOSX/._same")));
}

TEST_P(ForkBesideTest, AFileWithOtherValuesThanAreToStayIsNotConverted) {
    Make("file");
    ASSERT_THAT(Run({"set", At("file"), Colour(), "white"}), Succeeded());
    Put("._file", "red");
    EXPECT_EQ(2, Import({"--keep-existing"}).status);
    EXPECT_EQ(MacFileOf("red"), ReadFile(At("._file")));
    ASSERT_EQ(0, unlink(At("._file").c_str()));
    EXPECT_EQ("white", Get("file", Colour()));
}

// ---- What stays ---------------------------------------------------------------------------------

TEST_P(ImportTreeTest, WhatCannotBeImportedStaysAndIsNamed) {
    for (const std::string name : {"good", "text", "empty", "damaged", "link", "pipe", "names"}) {
        Make(name);
    }
    fs::create_directories(At("__MACOSX/gone/deep"));
    fs::create_directories(At("elsewhere"));
    Put("__MACOSX/._good", "red");
    const auto put = [&](const std::string& path, const Bytes& bytes) {
        WriteFile(At(path), bytes);
        return std::pair(path, bytes);
    };
    Bytes damaged = MacFileOf("red");
    damaged.resize(100);
    const std::vector<std::pair<std::string, Bytes>> files = {
        put("__MACOSX/._orphan", MacFileOf("red")),
        put("__MACOSX/gone/deep/._orphan", MacFileOf("red")),
        put("__MACOSX/._text", Ascii("This is not what its name says that it is.")),
        put("__MACOSX/._empty", {}),
        put("__MACOSX/._damaged", damaged),
        put("__MACOSX/junk", Ascii("junk")),
        put("__MACOSX/._names", MacFileOf("red")),
    };
    WriteFile(At("elsewhere/secret"), MacFileOf("red"));
    ASSERT_EQ(0, symlink(At("elsewhere/secret").c_str(), At("__MACOSX/._link").c_str()));
    ASSERT_EQ(0, mkfifo(At("__MACOSX/._pipe").c_str(), 0600));
    ASSERT_EQ(0, link(At("__MACOSX/._names").c_str(), At("elsewhere/second").c_str()));
    const ToolResult result = Import();
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.out, HasSubstr("1 imported, "));
    EXPECT_THAT(result.out, HasSubstr(", 9 failed\n"));
    for (const auto& [path, bytes] : files) {
        ASSERT_TRUE(Exists(At(path))) << path;
        EXPECT_EQ(bytes, ReadFile(At(path))) << path;
        EXPECT_THAT(result.err, HasSubstr("mavoea: " + At(path) + ": ")) << path;
    }
    for (const std::string name : {"link", "pipe"}) {
        EXPECT_TRUE(fs::exists(fs::symlink_status(At("__MACOSX/._" + name)))) << name;
        EXPECT_THAT(result.err, HasSubstr(At("__MACOSX/._" + name) + ": ")) << name;
    }
    for (const std::string name : {"text", "empty", "damaged", "link", "pipe", "names"}) {
        EXPECT_EQ("", Run({"list", At(name)}).out) << name;
    }
    ExpectColour("good", "red");
    EXPECT_FALSE(Exists(At("__MACOSX/._good")));
}

TEST_P(BesideTest, OrphansBesideNothingStayAndAreNamed) {
    MakeDir(At("sub"));
    Put("._gone", "red");
    Put("sub/._gone", "red");
    const ToolResult result = Import();
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(Counts(0, 0, 2), result.out);
    for (const std::string path : {"._gone", "sub/._gone"}) {
        EXPECT_THAT(result.err, HasSubstr("mavoea: " + At(path) + ": its object is missing; "));
        EXPECT_EQ(MacFileOf("red"), ReadFile(At(path)));
    }
}

TEST_P(BesideTest, MetadataOfMetadataStays) {
    Make("file");
    Put("._file", "red");
    Put("._._file", "green");
    const ToolResult result = Import();
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(Counts(1, 0, 1), result.out);
    ExpectColour("file", "red");
    ASSERT_TRUE(Exists(At("._._file")));
    EXPECT_EQ(MacFileOf("green"), ReadFile(At("._._file")));
}

TEST_P(ImportTreeTest, LinksToDirectoriesAreNotEntered) {
    Make("elsewhere/file");
    Put("elsewhere/.__MACOSX/._file", "red");
    ASSERT_EQ(0, rename(At("elsewhere/.__MACOSX").c_str(), At("mirror").c_str()));
    MakeDir(At("tree"));
    WriteFile(At("tree/file"), Ascii("data"));
    ASSERT_EQ(0, symlink(At("mirror").c_str(), At("tree/__MACOSX").c_str()));
    ASSERT_EQ(0, symlink(At("elsewhere").c_str(), At("tree/link").c_str()));
    const ToolResult result = Run({"import", "-r", At("tree")});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr(At("tree/__MACOSX")));
    EXPECT_EQ(MacFileOf("red"), ReadFile(At("mirror/._file")));
    EXPECT_EQ("", Run({"list", At("tree/file")}).out);
}

// What does not fit is named, and the file has it still.
TEST(ImportTreeElsewhereTest, WhatHasNoPlaceKeepsTheFile) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const TempDir dir;
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir.path());
    WriteFile(dir / "file", Ascii("data"));
    const Bytes bytes =
        MacSidecar({.attributes = {{"user.a", Ascii("1")}, {"com.apple.quarantine", Ascii("q")}}})
            .bytes;
    WriteFile(dir / "._file", bytes);
    const ToolResult result =
        RunTool({"--volume", dir.path() + "=xattr", "import", "-r", dir.path()});
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(Counts(0, 0, 1), result.out);
    EXPECT_THAT(result.err, HasSubstr("com.apple.quarantine"));
    EXPECT_EQ(Ascii("1"), FileAttribute(dir / "file", "user.a"));
    EXPECT_EQ(bytes, ReadFile(dir / "._file"));
}

TEST(ImportTreeElsewhereTest, OnVolumesWithoutMetadataEverythingStays) {
    const TempDir dir;
    WriteFile(dir / "file", Ascii("data"));
    const Bytes bytes = MacSidecar({.attributes = {{"user.a", Ascii("1")}}}).bytes;
    WriteFile(dir / "._file", bytes);
    const ToolResult result = RunTool({"--volume", dir.path() + "=4", "import", "-r", dir.path()});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr(dir / "._file" + ": it stays: "));
    EXPECT_EQ(bytes, ReadFile(dir / "._file"));
}

TEST(ImportTreeElsewhereTest, WhereAnotherProgramKeepsMetadataAndNobodyHasSaidSoEverythingStays) {
    const TempDir dir;
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir.path());
    WriteFile(dir / "file", Ascii("data"));
    SetFileAttribute(dir / "file", "user.DosStream.a:$DATA", Hex("'a' 00"));
    const Bytes bytes = MacSidecar({.attributes = {{"user.a", Ascii("1")}}}).bytes;
    WriteFile(dir / "._file", bytes);
    const ToolResult result = RunTool({"import", "-r", dir.path()});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("--volume " + dir.path() + "=samba"));
    EXPECT_EQ(bytes, ReadFile(dir / "._file"));
}

// ---- What is interrupted ------------------------------------------------------------------------

class KilledTest : public ImportTreeTest {
 protected:
    void SetUp() override {
        ImportTreeTest::SetUp();
        if (!IsSkipped()) MAVOEA_SKIP_UNLESS_STOPPED();
    }

    // An object with a file beside it; one with a file in an archive's folder that says something
    // else; one with its own value besides.
    void MakeAll() const {
        for (const std::string& name : NamesIn(dir_.path())) fs::remove_all(At(name));
        Make("file");
        Put("._file", "red");
        Make("sub/both");
        Put("sub/._both", "blue");
        fs::create_directories(At("__MACOSX/sub"));
        WriteFile(
            At("__MACOSX/sub/._both"),
            MacSidecar({.attributes = {{Colour(), Ascii("green")}, {"user.outer", Ascii("outer")}}})
                .bytes);
        Make("own");
        ASSERT_THAT(Run({"set", At("own"), "user.own", "mine"}), Succeeded());
        Put("__MACOSX/._own", "white");
    }

    // Whether a value is in a file that is to be imported, or in use.
    bool Has(const std::string& path, const std::vector<std::string>& files,
             const std::string& name, const std::string& value) const {
        for (const std::string& file : files) {
            if (!Exists(At(file))) continue;
            const auto contents = ReadMacFile(ReadFile(At(file)));
            if (!contents) continue;
            const auto found = contents->attributes.find(name);
            if (found != contents->attributes.end() && found->second == Ascii(value)) return true;
            if (name == kFinderInfoName && contents->finder_info == Ascii(value)) return true;
            if (name == kForkName && contents->fork == Ascii(value)) return true;
        }
        return Get(path, name) == value;
    }
    void ExpectNothingLost() const {
        const auto expect = [&](const std::string& path, const std::vector<std::string>& files,
                                const std::string& colour) {
            // Where the file beside it is in use the other one's values replace it.
            const bool replaced = kind_.in_place && path == "sub/both";
            EXPECT_TRUE(Has(path, files, Colour(), colour) ||
                        (replaced && Has(path, {}, Colour(), "green")))
                << path;
            if (!kind_.keeps_everything) return;
            const Bytes finder_info = FinderInfoOf(colour);
            EXPECT_TRUE(Has(path, files, kFinderInfoName, {finder_info.begin(), finder_info.end()}))
                << path;
            EXPECT_TRUE(Has(path, files, kForkName, "fork of " + colour)) << path;
        };
        expect("file", {"._file"}, "red");
        expect("sub/both", {"sub/._both"}, "blue");
        EXPECT_TRUE(Has("sub/both", {"__MACOSX/sub/._both", "sub/._both"}, "user.outer", "outer"));
        expect("own", {"__MACOSX/._own"}, "white");
        EXPECT_EQ("mine", Get("own", "user.own"));
    }

    // What is there: files, and what the objects have.
    std::map<std::string, Bytes> State() const {
        std::map<std::string, Bytes> state;
        for (const std::string& path : Tree(dir_.path())) {
            if (path.ends_with('/')) {
                state[path] = {};
                continue;
            }
            state[path] = ReadFile(At(path));
            for (const std::string& name : AttributesOf(At(path))) {
                // That something was done, and when.
                if (name == kMarksAttribute || name.find("flush") != std::string::npos) continue;
                state[path + " " + name] = FileAttribute(At(path), name);
            }
        }
        return state;
    }
    static std::vector<std::string> AttributesOf(const std::string& path) {
        std::vector<char> list(65536);
        const ssize_t size = llistxattr(path.c_str(), list.data(), list.size());
        std::vector<std::string> names;
        for (ssize_t at = 0; at < size; at += static_cast<ssize_t>(names.back().size()) + 1) {
            names.emplace_back(&list[static_cast<std::size_t>(at)]);
        }
        return names;
    }
};
INSTANTIATE_TEST_SUITE_P(Kinds, KilledTest,
                         ::testing::ValuesIn(Thinned(std::vector<Kind>{
                             kEaDirKind, kAppleDoubleKind, kFileEaKind, kXattrKind, kSambaKind,
                             kSambaStreamKind, kSambaAllKind, kNetatalkKind})),
                         [](const auto& tested) { return NameOf(tested.param); });

// Promise: "The tool: `import -r` |"
TEST_P(KilledTest, TheSameCommandAgainEndsAsOneThatWasNotKilled) {
    MakeAll();
    ASSERT_EQ(0, Import().status);
    const auto done = State();
    ASSERT_FALSE(done.contains("__MACOSX/"));
    KillAtEachChange(
        ImportArguments(), dir_.path(), [this] { MakeAll(); },
        [&] {
            ExpectNothingLost();
            EXPECT_EQ(0, Import().status);
            EXPECT_THAT(Differences(done, State()), IsEmpty());
        },
        {}, Says::kNotes);
}

// Promise: "The tool: `import -r` syncs the volume"
TEST_P(KilledTest, NothingIsRemovedBeforeTheVolumeIsSynced) {
    MakeAll();
    int unsynced = 0;
    bool dirty = false;
    const StoppedRun run = RunStopped(
        ImportArguments(), dir_.path(),
        [&](const FileCall& call) {
            const bool removes = call.name == "unlinkat" || call.name == "unlink";
            bool source = false;
            for (const FileCall::LookUp& look_up : call.look_ups) {
                source |= look_up.path.find("/._") != std::string::npos;
            }
            // A file is synced alone, and with its directory, where it takes the place of another.
            if (kind_.fork_beside ? call.Syncs() : call.name == "syncfs") {
                dirty = false;
            } else if (removes && source) {
                unsynced += dirty ? 1 : 0;
            } else if (call.Changes() && !removes) {
                dirty = true;
            }
            return true;
        },
        Stops::kAtSyncsToo);
    EXPECT_EQ(0, run.status) << run.err;
    EXPECT_EQ(0, unsynced);
}

// What takes the place of metadata is on disk before.
TEST_P(KilledTest, WhatAnObjectHadIsReplacedByWhatIsOnDisk) {
    Make("own");
    ASSERT_THAT(Run({"set", At("own"), "user.own", "mine"}), Succeeded());
    Put("__MACOSX/._own", "white");
    bool dirty = false;
    int replaced = 0;
    const StoppedRun run = RunStopped(
        ImportArguments(), dir_.path(),
        [&](const FileCall& call) {
            if (call.Syncs()) {
                dirty = false;
            } else if (call.name.starts_with("rename")) {
                EXPECT_FALSE(dirty) << ::testing::PrintToString(call);
                ++replaced;
            } else if (call.name.find("write") != std::string::npos) {
                dirty = true;
            }
            return true;
        },
        Stops::kAtSyncsToo);
    EXPECT_EQ(0, run.status) << run.err;
    const bool in_files = kind_.in_place || kind_.type == "eadir" || kind_.type == "fileea";
    EXPECT_EQ(in_files, replaced > 0);
}

// One sync for all objects that had nothing before.
TEST_P(KilledTest, ManyNewObjectsTakeOneSync) {
    if (kind_.fork_beside || kind_.type == "xattr") GTEST_SKIP() << "files change in place";
    const auto syncs_of = [&](int count) {
        for (const std::string& name : NamesIn(dir_.path())) fs::remove_all(At(name));
        for (int i = 0; i < count; ++i) {
            Make("file" + std::to_string(i));
            Put("__MACOSX/._file" + std::to_string(i), "red");
        }
        int syncs = 0;
        const StoppedRun run = RunStopped(
            ImportArguments(), dir_.path(),
            [&](const FileCall& call) {
                syncs += call.Syncs() ? 1 : 0;
                return true;
            },
            Stops::kAtSyncsToo);
        EXPECT_EQ(0, run.status) << run.err;
        return syncs;
    };
    EXPECT_EQ(1, syncs_of(1));
    EXPECT_EQ(1, syncs_of(20));
}

// What a Mac writes meanwhile is not removed.
TEST_P(KilledTest, AFileThatHasChangedStays) {
    Make("file");
    Put("__MACOSX/._file", "red");
    Bytes changed = MacFileOf("red");
    changed.push_back(0);
    const StoppedRun run = RunStopped(ImportArguments(), dir_.path(), [&](const FileCall&) {
        // When the object has got what it holds.
        if (Get("file", Colour()) != "red") return true;
        WriteFile(At("__MACOSX/._file"), changed);
        return false;
    });
    EXPECT_EQ(2, run.status);
    EXPECT_THAT(run.err, HasSubstr(At("__MACOSX/._file") + ": it has changed since it was read"));
    ASSERT_TRUE(Exists(At("__MACOSX/._file")));
    EXPECT_EQ(changed, ReadFile(At("__MACOSX/._file")));
}

// ---- Files of other programs --------------------------------------------------------------------

TEST_P(BesideTest, FilesThatOthersWroteArrive) {
    const std::vector<SampleFile> samples = SampleFiles();
    if (samples.empty()) GTEST_SKIP() << kNoSampleFiles;
    for (std::size_t i = 0; i < samples.size(); i += SeriesStep()) {
        SCOPED_TRACE(samples[i].name);
        const std::string name = "sample" + std::to_string(i);
        Make("tree/" + name);
        WriteFile(At("tree/._" + name), samples[i].bytes);
        const ToolResult result = Run({"import", "-r", At("tree")});
        const auto& contents = samples[i].contents;
        if (!contents) {
            EXPECT_EQ(2, result.status);
            EXPECT_EQ(samples[i].bytes, ReadFile(At("tree/._" + name)));
        } else if (result.status == 0) {
            for (const auto& [attribute, value] : contents->attributes) {
                EXPECT_EQ(value, Ascii(Get("tree/" + name, attribute))) << attribute;
            }
        } else {
            // What ext4 has no room or no name for.
            EXPECT_THAT(result.err, HasSubstr(At("tree/._" + name)));
            EXPECT_TRUE(Exists(At("tree/._" + name)));
        }
        fs::remove_all(At("tree"));
    }
}

// ---- Output and arguments -----------------------------------------------------------------------

TEST_F(InUseTest, TheCountsAreThereForPrograms) {
    Make("file");
    Make("other");
    Put("._file", "red");
    Put("__MACOSX/._other", "green");
    Put("__MACOSX/._gone", "green");
    const ToolResult result = Import({"--json"});
    EXPECT_EQ(2, result.status);
    const nlohmann::json json = result.json();
    EXPECT_EQ("importing", json["task"]);
    EXPECT_EQ(1, json["done"]);
    EXPECT_EQ(1, json["current"]);
    EXPECT_EQ(1, json["failed"]);
    EXPECT_EQ(At("__MACOSX/._gone"), json["failures"][0]["path"]);
}

TEST_F(InUseTest, ArgumentsThatAreWrongAreTold) {
    Make("file");
    MakeDir(At("__MACOSX"));
    EXPECT_THAT(Run({"import", "-r", At("file")}).err,
                HasSubstr("mavoea: " + At("file") + ": it is no directory; "));
    EXPECT_THAT(Run({"import", "-r", At("__MACOSX")}).err,
                HasSubstr("what it holds is of objects beside it; name the directory"));
    EXPECT_EQ(1, Run({"import", "-r", At("missing")}).status);
    EXPECT_EQ(2, Run({"import", "-r", "--data", dir_.path()}).status);
    EXPECT_EQ(2, Run({"import", "--keep", At("file"), At("file")}).status);
    EXPECT_EQ(2, Run({"import", "-r"}).status);
}

TEST_P(ImportTreeTest, SeveralDirectoriesAreImportedOneAfterTheOther) {
    Make("a/file");
    Make("b/file");
    Put("a/__MACOSX/._file", "red");
    Put("b/__MACOSX/._file", "green");
    EXPECT_THAT(Run({"import", "-r", At("a"), At("b")}), Succeeded());
    ExpectColour("a/file", "red");
    ExpectColour("b/file", "green");
}

}  // namespace
}  // namespace mavoea::test

// Objects whose long names become the same in the EA directory: metadata belongs to one of them.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <optional>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/second_volume.h"
#include "tests/support/snapshot.h"
#include "tests/tool/holdings.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;
using ::testing::IsEmpty;

// Two names of objects beside each other that share their files' names.
struct Pair {
    const char* label;
    std::string owner;  // has metadata
    std::string other;  // has none
};

std::vector<Pair> Pairs() {
    const std::string head(241, 'n');
    return {
        {"Letters", head + "abcdefghi", head + "ihgfedcba"},
        {"Extensions", head + "abcde.txt", head + "edcba.txt"},
        {"Shortened", head + "abcdefghz", ShortenedName(head + "abcdefghz")},
        {"Long", ShortenedName(head + "abcdefghz"), head + "abcdefghz"},
    };
}

struct Case {
    int type;
    Pair pair;
};
void PrintTo(const Case& tested, std::ostream* out) {
    *out << tested.pair.label << " on type " << tested.type;
}

std::vector<Case> Cases() {
    std::vector<Case> cases;
    for (const int type : Types({1, 2, 3, 6, 10})) {
        for (const Pair& pair : Pairs()) cases.push_back({type, pair});
    }
    return Thinned(cases);
}

MATCHER_P3(EndsAndNamesBoth, status, one, other, "ends with that status and names both objects") {
    return arg.status == status && arg.err.find(one) != std::string::npos &&
           arg.err.find(other) != std::string::npos;
}

const Attribute kColour = {"user.colour", Ascii("blue")};
const Bytes kFork = Pattern(3000, 9);

Bytes ResourceOf(const Bytes& fork) { return PlainAppleDouble(Pattern(32, 0x40), fork); }

class SharedNamesTest : public ::testing::TestWithParam<Case> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
        ASSERT_EQ(ShortenedName(pair().owner), ShortenedName(pair().other));
        ASSERT_EQ(242U, ShortenedName(pair().owner).size());
        MakeDir(In());
        MakeDir(elsewhere());
        WriteFile(owner(), Ascii("data of the owner"));
        WriteFile(other(), Ascii("data of the other"));
        PutStream(owner(), StreamImage{.attributes = {kColour}}.Build());
        PutResource(owner(), ResourceOf(kFork));
        before_ = TakeSnapshot(EaDirectory());
    }

    static const Pair& pair() { return GetParam().pair; }
    static int type() { return GetParam().type; }

    std::string In(const std::string& name = {}) const { return dir_ / ("v/" + name); }
    std::string EaDirectory() const { return In("@eaDir"); }
    std::string owner() const { return In(pair().owner); }
    std::string other() const { return In(pair().other); }
    std::string elsewhere() const { return dir_ / "w"; }

    // Another object with metadata, in the directory or beside it.
    std::string MakeThird(const std::string& path) const {
        WriteFile(path, Ascii("data of the third"));
        PutStream(path, StreamImage{.attributes = {{"user.colour", Ascii("green")}}}.Build());
        return path;
    }

    ToolResult Run(Arguments arguments, std::optional<int> elsewhere_type = {}) const {
        const std::string there = std::to_string(elsewhere_type.value_or(type()));
        arguments.insert(arguments.begin(), {"--volume", In() + "=" + std::to_string(type()),
                                             "--volume", elsewhere() + "=" + there});
        return RunTool(arguments);
    }

    // Refused for the sake of the owner, whose files have not changed. What is moved or removed is
    // the object itself; elsewhere it is metadata only.
    void ExpectRefused(const Arguments& arguments, std::optional<int> elsewhere_type = {}) const {
        const ToolResult result = Run(arguments, elsewhere_type);
        const auto names = [&](const char* command) {
            return std::find(arguments.begin(), arguments.end(), command) != arguments.end();
        };
        EXPECT_THAT(result, EndsAndNamesBoth(names("mv") || names("rm") ? 1 : 2, pair().owner,
                                             pair().other));
        ExpectOwnerUntouched();
    }

    void ExpectOwnerUntouched() const {
        const MetadataPaths paths(owner());
        const std::string names[] = {fs::path(paths.stream).filename().string(),
                                     fs::path(paths.resource).filename().string()};
        Snapshot now = TakeSnapshot(EaDirectory());
        for (const std::string& name : names) {
            ASSERT_TRUE(now.contains(name)) << name;
            EXPECT_THAT(Differences({{name, before_.at(name)}}, {{name, now.at(name)}}, {"atime"}),
                        IsEmpty());
        }
        EXPECT_EQ(Ascii("data of the owner"), BytesIn(owner()));
    }

    const TempDir dir_{FastDirectory()};
    Snapshot before_;
};

INSTANTIATE_TEST_SUITE_P(EveryPair, SharedNamesTest, ::testing::ValuesIn(Cases()),
                         [](const auto& tested) {
                             return std::string(tested.param.pair.label) + "Type" +
                                    std::to_string(tested.param.type);
                         });

TEST_P(SharedNamesTest, NothingIsSetOrRemovedInAnothersFiles) {
    ExpectRefused({"set", other(), "user.colour", "red"});
    ExpectRefused({"set", other(), "user.new", "red"});
    ExpectRefused({"set", other(), kFinderInfoName, "--hex", std::string(64, '1')});
    ExpectRefused({"set", other(), kForkName, "fork"});
    ExpectRefused({"remove", other(), "user.colour"});
    ExpectRefused({"remove", other(), kForkName});
}

TEST_P(SharedNamesTest, TheLockOfOneLeavesTheFilesOfTheOther) {
    for (const char* command : {"lock", "unlock"}) {
        Run({command, other()});
        ExpectOwnerUntouched();
    }
}

TEST_P(SharedNamesTest, WhatIsCopiedOverOneLeavesTheFilesOfTheOther) {
    ExpectRefused({"cp", MakeThird(In("third")), other()});
    const std::string outside = MakeThird(elsewhere() + "/third");
    ExpectRefused({"cp", outside, other()});
    ExpectRefused({"cp", "-T", outside, other()});
    ExpectRefused({"convert", "--to", std::to_string(type()), outside, other()});
}

TEST_P(SharedNamesTest, WhatIsMovedOverOneLeavesTheFilesOfTheOther) {
    for (const std::string& third : {In("third"), elsewhere() + "/third"}) {
        MakeThird(third);
        const Bytes stream = BytesIn(MetadataPaths(third).stream);
        ExpectRefused({"mv", third, other()});
        EXPECT_EQ(Ascii("data of the third"), BytesIn(third));
        EXPECT_EQ(stream, BytesIn(MetadataPaths(third).stream));
    }
}

TEST_P(SharedNamesTest, ACopyOfWhatHasNoMetadataTakesNoneFromTheOther) {
    WriteFile(In("plain"), Ascii("new"));
    Run({"cp", In("plain"), other()});
    ExpectOwnerUntouched();
    Run({"mv", In("plain"), other()});
    ExpectOwnerUntouched();
}

TEST_P(SharedNamesTest, NeitherOfThemIsMovedOrRemovedWhileFilesMayBeOfBoth) {
    for (const std::string& path : {other(), owner()}) {
        ExpectRefused({"mv", path, In("free")});
        ExpectRefused({"mv", path, elsewhere()});
        ExpectRefused({"mv", path, elsewhere()}, 0);
        ExpectRefused({"rm", path});
        ExpectRefused({"rm", "-f", path});
        EXPECT_TRUE(Exists(path));
    }
    EXPECT_EQ(Ascii("data of the other"), BytesIn(other()));
}

TEST_P(SharedNamesTest, NeitherOfThemIsMovedToAnotherFileSystem) {
    const SecondVolume second;
    if (!second.ok()) GTEST_SKIP() << "no second file system here; run this test as the root";
    for (const std::string& path : {other(), owner()}) {
        ExpectRefused({"--volume", second.path() + "=1", "mv", path, second.path()});
        EXPECT_TRUE(Exists(path));
    }
}

TEST_P(SharedNamesTest, AnEarlierLayoutIsNotConvertedIntoAnothersFiles) {
    PutLegacy(other(), "user.shape", Ascii("round"));
    PutLegacy(other(), "MAVO:Resource", ResourceOf({}));
    const Snapshot folder = TakeSnapshot(MetadataPaths(other()).folder);
    ExpectRefused({"upgrade", other()});
    ExpectRefused({"upgrade", "-r", In()});
    EXPECT_THAT(Differences(folder, TakeSnapshot(MetadataPaths(other()).folder), {"atime"}),
                IsEmpty());
}

TEST_P(SharedNamesTest, AnAppleDoubleFileIsNotImportedIntoAnothersFiles) {
    const std::string file = dir_ / "file";
    WriteFile(file, MacSidecar({{{"user.shape", Ascii("round")}}, Pattern(32, 1), kFork}).bytes);
    ExpectRefused({"import", file, other()});
}

TEST_P(SharedNamesTest, AResourceFileIsNotRepairedForAnother) {
    PutResource(owner(),
                StreamImage{.attributes = {{"user.shape", Ascii("round")}}, .fork = kFork}.Build());
    before_ = TakeSnapshot(EaDirectory());
    ExpectRefused({"repair", other()});
    ExpectRefused({"repair", "-r", In()});
}

TEST_P(SharedNamesTest, TheLastOneOfThemIsRemovedWithTheFiles) {
    ASSERT_EQ(0, unlink(other().c_str()));
    EXPECT_THAT(Run({"rm", owner()}), Succeeded());
    EXPECT_FALSE(Exists(owner()));
    EXPECT_FALSE(Exists(MetadataPaths(owner()).stream));
    EXPECT_FALSE(Exists(MetadataPaths(owner()).resource));
}

TEST_P(SharedNamesTest, TheLastOneOfThemMovesWithTheFiles) {
    ASSERT_EQ(0, unlink(other().c_str()));
    EXPECT_THAT(Run({"mv", owner(), In("free")}), Succeeded());
    const Holdings found = HoldingsOf(type(), In("free"));
    EXPECT_TRUE(found.HasAttribute(kColour));
    EXPECT_TRUE(found.HasFork(kFork));
    EXPECT_FALSE(Exists(MetadataPaths(owner()).stream));
    EXPECT_FALSE(Exists(MetadataPaths(owner()).resource));
}

// A directory that is renamed takes all along that is in it.
TEST_P(SharedNamesTest, TheirDirectoryMovesWithBoth) {
    MakeDir(In("sub"));
    const std::string names[] = {In("sub/" + pair().owner), In("sub/" + pair().other)};
    for (const std::string& name : names) WriteFile(name, {});
    PutStream(names[0], StreamImage{.attributes = {kColour}}.Build());
    EXPECT_THAT(Run({"mv", In("sub"), In("moved")}), Succeeded());
    EXPECT_TRUE(HoldingsOf(type(), In("moved/" + pair().owner)).HasAttribute(kColour));
    EXPECT_TRUE(Exists(In("moved/" + pair().other)));
}

TEST_P(SharedNamesTest, ObjectsWithoutFilesThereAreNotHindered) {
    ASSERT_EQ(0, unlink(MetadataPaths(owner()).stream.c_str()));
    ASSERT_EQ(0, unlink(MetadataPaths(owner()).resource.c_str()));
    const std::string third = In("third");
    WriteFile(third, Ascii("new"));
    EXPECT_THAT(Run({"cp", third, other()}), Succeeded());
    EXPECT_EQ(Ascii("new"), BytesIn(other()));
    EXPECT_THAT(Run({"cp", owner(), elsewhere()}), Succeeded());
    EXPECT_THAT(Run({"mv", third, other()}), Succeeded());
    EXPECT_THAT(Run({"mv", other(), In("free")}), Succeeded());
    EXPECT_THAT(Run({"mv", In("free"), other()}), Succeeded());
    EXPECT_THAT(Run({"mv", other(), elsewhere()}), Succeeded());
    WriteFile(other(), {});
    EXPECT_THAT(Run({"rm", other()}), Succeeded());
    EXPECT_EQ(Ascii("data of the owner"), BytesIn(owner()));
}

TEST_P(SharedNamesTest, MetadataOfOtherNamesIsNotHindered) {
    WriteFile(In("third"), {});
    for (const std::string& third : {In("third"), In(std::string(250, 'o'))}) {
        WriteFile(third, {});
        EXPECT_THAT(Run({"set", third, "user.colour", "red"}), Succeeded());
        EXPECT_THAT(Run({"mv", third, elsewhere()}), Succeeded());
    }
    ExpectOwnerUntouched();
}

// Beside the objects each "._" file has a name of its own.
TEST_P(SharedNamesTest, AppleDoubleVolumesDoNotShare) {
    const Volume volume(0, FastDirectory());
    const std::string one = volume.path() + '/' + pair().owner;
    const std::string two = volume.path() + '/' + pair().other;
    for (const std::string& path : {one, two}) {
        WriteFile(path, {});
        EXPECT_THAT(volume.Run({"set", path, "user.colour", path.substr(path.size() - 9)}),
                    Succeeded());
    }
    for (const std::string& path : {one, two}) {
        EXPECT_TRUE(
            HoldingsOf(0, path).HasAttribute({"user.colour", Ascii(path.substr(path.size() - 9))}));
    }
    EXPECT_THAT(volume.Run({"mv", one, volume.path() + "/free"}), Succeeded());
    EXPECT_THAT(volume.Run({"cp", volume.path() + "/free", one}), Succeeded());
    EXPECT_THAT(volume.Run({"rm", one}), Succeeded());
    EXPECT_TRUE(
        HoldingsOf(0, two).HasAttribute({"user.colour", Ascii(two.substr(two.size() - 9))}));
}

}  // namespace
}  // namespace mavoea::test

// mavoea mv, on real files.

#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/ways.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class MvWayTest : public WayTest<Travel> {
 protected:
    const Travel& travel() const { return places(); }
};
INSTANTIATE_TEST_SUITE_P(EveryWay, MvWayTest, ::testing::ValuesIn(Thinned(AllWays())), NameOf);

TEST_P(MvWayTest, FilesGoWithMetadataAndLeaveNothing) {
    travel().MakeFile(travel().From("a"));
    travel().GiveMetadata(travel().From("a"));
    EXPECT_THAT(travel().Run({"mv", travel().From("a"), travel().To("b")}), Succeeded());
    EXPECT_EQ("data", TextOf(travel().To("b")));
    travel().ExpectMetadata(travel().To("b"));
    EXPECT_THAT(NamesIn(travel().source()), ElementsAre());
    EXPECT_THAT(Travel::ObjectsIn(travel().target()), ElementsAre("b"));
}

TEST_P(MvWayTest, DirectoriesGoWithAllThatIsInThem) {
    mkdir(travel().From("tree").c_str(), 0750);
    mkdir(travel().From("tree/sub").c_str(), 0705);
    travel().MakeFile(travel().From("tree/sub/file"));
    travel().GiveMetadata(travel().From("tree"), "white");
    travel().GiveMetadata(travel().From("tree/sub"), "black");
    travel().GiveMetadata(travel().From("tree/sub/file"), "green");
    // Below a directory that is renamed all stays as it is, on volumes of one kind.
    EXPECT_THAT(travel().Run({"mv", travel().From("tree"), travel().target()}), Succeeded());
    EXPECT_EQ("data", TextOf(travel().To("tree/sub/file")));
    EXPECT_EQ(0750, ModeOf(travel().To("tree")));
    EXPECT_EQ(0705, ModeOf(travel().To("tree/sub")));
    travel().ExpectMetadata(travel().To("tree"), "white");
    travel().ExpectMetadata(travel().To("tree/sub"), "black");
    travel().ExpectMetadata(travel().To("tree/sub/file"), "green");
    EXPECT_THAT(NamesIn(travel().source()), ElementsAre());
}

TEST_P(MvWayTest, DifficultNamesAreNamesLikeAnyOther) {
    for (const std::string& name : DifficultNames()) {
        SCOPED_TRACE(name);
        travel().MakeFile(travel().From(name), name);
        travel().GiveMetadata(travel().From(name));
        EXPECT_THAT(travel().Run({"mv", travel().From(name), travel().target()}), Succeeded());
        EXPECT_EQ(name, TextOf(travel().To(name)));
        travel().ExpectMetadata(travel().To(name));
    }
    EXPECT_THAT(NamesIn(travel().source()), ElementsAre());
}

TEST_P(MvWayTest, TheMetadataOfWhatIsOverwrittenGoesWithIt) {
    travel().MakeFile(travel().From("a"), "new");
    travel().MakeFile(travel().To("a"), "old");
    travel().GiveMetadata(travel().To("a"));
    EXPECT_THAT(travel().Run({"mv", travel().From("a"), travel().To("a")}), Succeeded());
    EXPECT_EQ("new", TextOf(travel().To("a")));
    travel().ExpectNoMetadata(travel().To("a"));
}

class MvTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    }
    const Travel travel_{kEaDirectory, kEaDirectory};
};

TEST_F(MvTest, ARenameKeepsTheFileItself) {
    travel_.MakeFile(travel_.From("a"));
    const ino_t inode = StatusOf(travel_.From("a")).st_ino;
    EXPECT_THAT(travel_.Run({"mv", travel_.From("a"), travel_.To("a")}), Succeeded());
    EXPECT_EQ(inode, StatusOf(travel_.To("a")).st_ino);
}

TEST_F(MvTest, LinksAndSpecialFilesMoveToo) {
    const SecondVolume second;
    MAVOEA_SKIP_WITHOUT_SECOND(second);
    const Travel travel(kEaDirectory, kEaDirectory, second.path());
    ASSERT_EQ(0, symlink("nowhere", travel.From("link").c_str()));
    ASSERT_EQ(0, mkfifo(travel.From("fifo").c_str(), 0600));
    ASSERT_EQ(0, travel.Run({"set", travel.From("link"), Colour(), "blue"}).status);
    EXPECT_THAT(travel.Run({"mv", travel.From("link"), travel.From("fifo"), travel.target()}),
                Succeeded());
    EXPECT_EQ("nowhere", std::filesystem::read_symlink(travel.To("link")));
    EXPECT_EQ("blue", travel.Run({"get", travel.To("link"), Colour()}).out);
    EXPECT_TRUE(S_ISFIFO(StatusOf(travel.To("fifo")).st_mode));
    EXPECT_THAT(NamesIn(travel.source()), ElementsAre());
}

TEST_F(MvTest, TwoNamesOfOneFileStayTwo) {
    travel_.MakeFile(travel_.From("a"));
    ASSERT_EQ(0, link(travel_.From("a").c_str(), travel_.From("b").c_str()));
    travel_.GiveMetadata(travel_.From("a"));
    EXPECT_THAT(travel_.Run({"mv", travel_.From("a"), travel_.From("b")}),
                Failed(1, "'" + travel_.From("a") + "' and '" + travel_.From("b") +
                              "' are the same file; name another destination"));
    EXPECT_THAT(Travel::ObjectsIn(travel_.source()), ElementsAre("a", "b"));
    travel_.ExpectMetadata(travel_.From("a"));
    travel_.ExpectNoMetadata(travel_.From("b"));
}

TEST_F(MvTest, AskingAndForcingAndNeverTheLastCounts) {
    const auto text_after = [&](Arguments flags, const std::string& answer) {
        travel_.MakeFile(travel_.From("a"), "new");
        travel_.MakeFile(travel_.To("a"), "old");
        flags.insert(flags.begin(), "mv");
        flags.insert(flags.end(), {travel_.From("a"), travel_.To("a")});
        EXPECT_EQ(0, travel_.Run(flags, answer).status);
        return TextOf(travel_.To("a")) + (Exists(travel_.From("a")) ? "" : ", moved");
    };
    EXPECT_EQ("new, moved", text_after({}, "n\n"));
    EXPECT_EQ("old", text_after({"-i"}, "n\n"));
    EXPECT_EQ("new, moved", text_after({"-i"}, "y\n"));
    EXPECT_EQ("old", text_after({"-n"}, "y\n"));
    EXPECT_EQ("new, moved", text_after({"-n", "-f"}, "n\n"));
    EXPECT_EQ("old", text_after({"-f", "-i"}, "n\n"));
}

TEST_F(MvTest, ACopyAsksOnceOnly) {
    const SecondVolume second;
    MAVOEA_SKIP_WITHOUT_SECOND(second);
    const Travel travel(kEaDirectory, kEaDirectory, second.path());
    travel.MakeFile(travel.From("a"), "new");
    travel.MakeFile(travel.To("a"), "old");
    const ToolResult result = travel.Run({"mv", "-i", travel.From("a"), travel.To("a")}, "y\nn\n");
    EXPECT_EQ("mavoea: overwrite '" + travel.To("a") + "'? ", result.err);
    EXPECT_EQ("new", TextOf(travel.To("a")));
    EXPECT_FALSE(Exists(travel.From("a")));
}

TEST_F(MvTest, WhatMakesNoSenseIsRefused) {
    const std::string file = travel_.From("file");
    const std::string tree = travel_.From("tree");
    travel_.MakeFile(file);
    mkdir(tree.c_str(), 0755);
    mkdir(travel_.To("tree").c_str(), 0755);
    travel_.MakeFile(travel_.To("tree/inside"));
    const struct {
        Arguments arguments;
        std::string message;
    } cases[] = {
        {{file, file},
         "'" + file + "' and '" + file + "' are the same file; name another destination"},
        {{tree, tree + "/deep"},
         "cannot move '" + tree + "' to a subdirectory of itself, '" + tree +
             "/deep'; name another destination"},
        {{"-T", tree, file},
         "cannot overwrite non-directory '" + file + "' with directory '" + tree +
             "'; move it away"},
        {{"-T", file, tree},
         "cannot overwrite directory '" + tree + "' with non-directory; move it away"},
        {{tree, travel_.target()},
         "cannot move '" + tree + "' to '" + travel_.To("tree") +
             "': Directory not empty; try again, or check the volume"},
        {{tree + "/.", travel_.target()},
         "cannot move '" + tree + "/.' to '" + travel_.To(".") +
             "': Device or resource busy; try again, or check the volume"},
        {{travel_.From("none"), travel_.target()},
         "cannot stat '" + travel_.From("none") + "': No such file or directory; check the path"},
    };
    for (auto [arguments, message] : cases) {
        arguments.insert(arguments.begin(), "mv");
        EXPECT_THAT(travel_.Run(arguments), Failed(1, message)) << message;
    }
    EXPECT_THAT(NamesIn(travel_.source()), ElementsAre("file", "tree"));
}

TEST_F(MvTest, AnEmptyDirectoryIsReplacedWithItsMetadata) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/a"));
    mkdir(travel_.To("tree").c_str(), 0755);
    mkdir(travel_.To("tree/@eaDir").c_str(), 0777);
    travel_.GiveMetadata(travel_.To("tree"));
    EXPECT_THAT(travel_.Run({"mv", travel_.From("tree"), travel_.target()}), Succeeded());
    EXPECT_THAT(NamesIn(travel_.To("tree")), ElementsAre("a"));
    travel_.ExpectNoMetadata(travel_.To("tree"));
}

TEST_F(MvTest, WhenNotAllOfATreeArrivesTheSourceIsKeptWhole) {
    const SecondVolume small("size=64k", true);
    MAVOEA_SKIP_WITHOUT_SECOND(small);
    const Travel travel(kEaDirectory, kEaDirectory, small.path());
    mkdir(travel.From("tree").c_str(), 0755);
    travel.MakeFile(travel.From("tree/a"));
    travel.MakeFile(travel.From("tree/b"), std::string(100000, 'b'));
    travel.GiveMetadata(travel.From("tree/a"));
    const ToolResult result = travel.Run({"mv", travel.From("tree"), travel.target()});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.err, HasSubstr("'" + travel.To("tree/b") + "': No space left on device"));
    EXPECT_EQ("data", TextOf(travel.From("tree/a")));
    EXPECT_EQ(100000U, ReadFile(travel.From("tree/b")).size());
    travel.ExpectMetadata(travel.From("tree/a"));
    EXPECT_THAT(Travel::ObjectsIn(travel.To("tree")), ElementsAre("a"));
}

TEST_F(MvTest, MetadataThatDoesNotArriveKeepsTheSourceWhole) {
    const SecondVolume small("size=64k", true);
    MAVOEA_SKIP_WITHOUT_SECOND(small);
    const Travel travel(kEaDirectory, kEaDirectory, small.path());
    travel.MakeFile(travel.From("a"));
    travel.GiveMetadata(travel.From("a"));
    mkdir(travel.From("@eaDir/a").c_str(), 0777);
    travel.MakeFile(travel.From("@eaDir/a/MAVOPHOTO:BIG"), std::string(100000, 'x'));
    const ToolResult result = travel.Run({"mv", travel.From("a"), travel.To("a")});
    EXPECT_THAT(result, Failed(2, travel.From("a") + ": not all of its metadata arrived at " +
                                      travel.To("a") +
                                      ": \"/MAVOPHOTO:BIG\" of another service (No space left on "
                                      "device); keep the original, or take the rest along by "
                                      "hand"));
    EXPECT_EQ("data", TextOf(travel.From("a")));
    travel.ExpectMetadata(travel.From("a"));
    EXPECT_EQ(100000U, ReadFile(travel.From("@eaDir/a/MAVOPHOTO:BIG")).size());
}

TEST_F(MvTest, ARenameWhoseMetadataCannotFollowIsTakenBack) {
    const Travel travel(kAppleDouble, kAppleDouble);
    travel.MakeFile(travel.From("a"));
    travel.GiveMetadata(travel.From("a"));
    mkdir(travel.To("._a").c_str(), 0755);
    travel.MakeFile(travel.To("._a/in the way"));
    EXPECT_THAT(travel.Run({"mv", travel.From("a"), travel.To("a")}),
                Failed(1, travel.From("a") + ": something is in the way of its metadata at " +
                              travel.To("._a") + "; see what it is, and move it away"));
    EXPECT_EQ("data", TextOf(travel.From("a")));
    travel.ExpectMetadata(travel.From("a"));
    EXPECT_THAT(NamesIn(travel.source()), ElementsAre("._a", "a"));
    EXPECT_THAT(Tree(travel.target()), ElementsAre("._a/", "._a/in the way"));
}

TEST_F(MvTest, WhatIsInTheWayOfMetadataKeepsAllWhereItWas) {
    travel_.MakeFile(travel_.From("a"));
    travel_.GiveMetadata(travel_.From("a"));
    mkdir(travel_.From("@eaDir/a").c_str(), 0777);
    travel_.MakeFile(travel_.From("@eaDir/a/MAVOPHOTO:THUMB"), "thumbnail");
    mkdir(travel_.To("@eaDir").c_str(), 0777);
    travel_.MakeFile(travel_.To("@eaDir/a"), "no folder");
    EXPECT_EQ(1, travel_.Run({"mv", travel_.From("a"), travel_.To("a")}).status);
    EXPECT_FALSE(Exists(travel_.To("a")));
    ASSERT_TRUE(Exists(travel_.From("a")));
    travel_.ExpectMetadata(travel_.From("a"));
    EXPECT_TRUE(Exists(travel_.From("@eaDir/a/MAVOPHOTO:THUMB")));
    EXPECT_THAT(NamesIn(travel_.To("@eaDir")), ElementsAre("a"));
}

TEST_F(MvTest, MetadataOfNoObjectGoesWithItsDirectory) {
    const SecondVolume second;
    MAVOEA_SKIP_WITHOUT_SECOND(second);
    const Travel travel(kEaDirectory, kEaDirectory, second.path());
    mkdir(travel.From("tree").c_str(), 0755);
    travel.MakeFile(travel.From("tree/a"));
    travel.GiveMetadata(travel.From("tree/a"));
    travel.MakeFile(travel.From("tree/._gone"), "whose?");
    travel.MakeFile(travel.From("tree/@eaDir/gone@MavoEAStream"), "of none");
    EXPECT_THAT(travel.Run({"mv", travel.From("tree"), travel.target()}), Succeeded());
    EXPECT_THAT(NamesIn(travel.source()), ElementsAre());
    EXPECT_EQ("whose?", TextOf(travel.To("tree/._gone")));
    EXPECT_EQ("of none", TextOf(travel.To("tree/@eaDir/gone@MavoEAStream")));
    EXPECT_EQ("data", TextOf(travel.To("tree/a")));
    travel.ExpectMetadata(travel.To("tree/a"));
}

// What has the name of another object's "._" file, and is none.
class MvPrefixedTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
        MAVOEA_SKIP_WITHOUT_SECOND(second_);
    }

    // Longer than the header that it has not.
    const std::string text_ = std::string(200, 'q');
    const SecondVolume second_;
};
INSTANTIATE_TEST_SUITE_P(Types, MvPrefixedTest, ::testing::Values(kAppleDouble, kEaDirectory));

TEST_P(MvPrefixedTest, ItGoesInItsOwnTurnWithItsOwnMetadata) {
    const Travel travel(GetParam(), GetParam(), second_.path());
    const auto make = [&](const std::string& directory) {
        travel.MakeFile(directory + "x");
        travel.MakeFile(directory + "._x", text_);
        travel.GiveMetadata(directory + "._x");
    };
    const auto expect = [&](const std::string& directory) {
        EXPECT_EQ("data", TextOf(directory + "x"));
        EXPECT_EQ(text_, TextOf(directory + "._x"));
        travel.ExpectMetadata(directory + "._x");
    };
    mkdir(travel.From("tree").c_str(), 0755);
    make(travel.From("tree/"));
    const ToolResult tree = travel.Run({"mv", "-v", travel.From("tree"), travel.target()});
    EXPECT_THAT(tree, Succeeded());
    EXPECT_THAT(tree.out, HasSubstr("removed '" + travel.From("tree/._x") + "'\n"));
    expect(travel.To("tree/"));
    EXPECT_THAT(NamesIn(travel.source()), ElementsAre());

    make(travel.From(""));
    EXPECT_THAT(travel.Run({"mv", travel.From("x"), travel.From("._x"), travel.target()}),
                Succeeded());
    expect(travel.To(""));
    EXPECT_THAT(NamesIn(travel.source()), ElementsAre());
}

TEST_P(MvPrefixedTest, ItStaysWhereAnotherNameOfItGoes) {
    const Travel travel(GetParam(), GetParam(), second_.path());
    travel.MakeFile(travel.From("x"));
    travel.MakeFile(travel.From("y"), text_);
    ASSERT_EQ(0, link(travel.From("y").c_str(), travel.From("._x").c_str()));
    travel.GiveMetadata(travel.From("._x"));
    EXPECT_THAT(travel.Run({"mv", travel.From("y"), travel.From("x"), travel.target()}),
                Succeeded());
    EXPECT_EQ(text_, TextOf(travel.From("._x")));
    travel.ExpectMetadata(travel.From("._x"));
    EXPECT_FALSE(Exists(travel.To("._x")));
}

TEST_P(MvPrefixedTest, ItStaysWhereNotAllOfItArrives) {
    const Travel travel(GetParam(), kXattr, second_.path());
    travel.MakeFile(travel.From("x"));
    travel.MakeFile(travel.From("._x"), text_);
    const std::string value(300000, 'v');
    ASSERT_THAT(travel.Run({"set", travel.From("._x"), Colour()}, value), Succeeded());
    EXPECT_EQ(2, travel.Run({"mv", travel.From("x"), travel.From("._x"), travel.target()}).status);
    EXPECT_EQ(text_, TextOf(travel.From("._x")));
    EXPECT_EQ(value, travel.Run({"get", travel.From("._x"), Colour()}).out);
    EXPECT_FALSE(Exists(travel.From("x")));
}

// Metadata has none: what would be that of a "._" file, or of an "@eaDir", is an object.
TEST_P(MvPrefixedTest, WhatWouldBeMetadataOfMetadataIsAnObject) {
    const Travel travel(GetParam(), GetParam(), second_.path());
    const Bytes apple_double = StreamImage{.attributes = {{"a", Ascii("1")}}}.Build();
    const Bytes other = StreamImage{.attributes = {{"b", Ascii("2")}}}.Build();
    mkdir(travel.From("tree").c_str(), 0755);
    travel.MakeFile(travel.From("tree/x"));
    travel.MakeFile(travel.From("tree/own"));
    travel.GiveMetadata(travel.From("tree/own"));
    WriteFile(travel.From("tree/._x"), apple_double);
    WriteFile(travel.From("tree/._._x"), other);
    WriteFile(travel.From("tree/._._._x"), apple_double);  // metadata of that
    mkdir(travel.From("tree/@eaDir").c_str(), 0777);
    WriteFile(travel.From("tree/._@eaDir"), other);

    const auto expect = [&](const std::string& tree) {
        EXPECT_EQ("1", travel.Run({"get", tree + "/x", "a"}).out);
        EXPECT_EQ(other, ReadFile(tree + "/._._x"));
        EXPECT_EQ("1", travel.Run({"get", tree + "/._._x", "a"}).out);
        EXPECT_EQ(other, ReadFile(tree + "/._@eaDir"));
        travel.ExpectMetadata(tree + "/own");
    };
    expect(travel.From("tree"));
    EXPECT_EQ(0, travel.Run({"cp", "-r", travel.From("tree"), travel.To("copy")}).status);
    expect(travel.To("copy"));
    EXPECT_EQ(0,
              travel.Run({"diff", "-r", "--data", travel.From("tree"), travel.To("copy")}).status);
    EXPECT_EQ(0, travel.Run({"rm", "-r", travel.To("copy")}).status);
    EXPECT_FALSE(Exists(travel.To("copy")));
    EXPECT_EQ(0, travel
                     .Run({"convert", "-r", "--to", WordOfType(GetParam()), travel.From("tree"),
                           travel.To("converted")})
                     .status);
    expect(travel.To("converted"));
    EXPECT_EQ(0, travel.Run({"mv", travel.From("tree"), travel.target()}).status);
    expect(travel.To("tree"));
    EXPECT_FALSE(Exists(travel.From("tree")));
}

// Three names, each of nothing, of a file that is too short for metadata, of a longer one, or of an
// AppleDouble file.
std::vector<std::map<std::string, Bytes>> TreesOfPrefixes() {
    const std::vector<Bytes> contents = {{},
                                         Ascii("short"),
                                         Ascii(std::string(200, 'q')),
                                         StreamImage{.attributes = {{"a", Ascii("1")}}}.Build()};
    std::vector<std::map<std::string, Bytes>> trees;
    for (std::size_t i = 1; i < contents.size() * contents.size() * contents.size(); ++i) {
        std::map<std::string, Bytes> tree;
        std::size_t left = i;
        for (const char* name : {"x", "._x", "._._x"}) {
            const Bytes& content = contents[left % contents.size()];
            if (!content.empty()) tree[name] = content;
            left /= contents.size();
        }
        trees.push_back(tree);
    }
    return trees;
}

TEST_F(MvTest, EveryTreeOfPrefixedNamesArrives) {
    const SecondVolume second;
    MAVOEA_SKIP_WITHOUT_SECOND(second);
    const Travel travel(kAppleDouble, kAppleDouble, second.path());
    for (const std::map<std::string, Bytes>& tree : Thinned(TreesOfPrefixes())) {
        SCOPED_TRACE(::testing::PrintToString(tree));
        const auto expect = [&](const std::string& directory) {
            std::map<std::string, Bytes> found;
            for (const std::string& name : NamesIn(directory)) {
                found[name] = ReadFile(directory + '/' + name);
            }
            EXPECT_EQ(tree, found);
        };
        mkdir(travel.From("tree").c_str(), 0755);
        for (const auto& [name, content] : tree) WriteFile(travel.From("tree/" + name), content);
        EXPECT_THAT(travel.Run({"cp", "-r", travel.From("tree"), travel.To("copy")}), Succeeded());
        expect(travel.To("copy"));
        EXPECT_THAT(travel.Run({"mv", travel.From("tree"), travel.target()}), Succeeded());
        expect(travel.To("tree"));
        EXPECT_FALSE(Exists(travel.From("tree")));
        EXPECT_THAT(travel.Run({"rm", "-r", travel.To("copy"), travel.To("tree")}), Succeeded());
        EXPECT_THAT(NamesIn(travel.target()), ElementsAre());
    }
}

// On a volume of attributes a "._" file is a file like any other; elsewhere it would replace the
// metadata of another, or be replaced by it.
TEST_F(MvTest, AFileThatWouldBecomeMetadataOfAnotherIsToldOfAndKept) {
    const Bytes apple_double = StreamImage{.attributes = {{"a", Ascii("1")}}}.Build();
    for (const int type : {kAppleDouble, kEaDirectory, kFileEa}) {
        SCOPED_TRACE(type);
        const Travel travel(kXattr, type);
        mkdir(travel.From("tree").c_str(), 0755);
        travel.MakeFile(travel.From("tree/x"));
        WriteFile(travel.From("tree/._x"), apple_double);
        EXPECT_THAT(
            travel.Run({"mv", travel.From("tree"), travel.target()}),
            Failed(1, travel.From("tree/._x") + ": it would be metadata of '" +
                          travel.To("tree/x") + "', just made, there; give it another name"));
        EXPECT_THAT(NamesIn(travel.From("tree")), ElementsAre("._x", "x"));
        EXPECT_EQ(apple_double, ReadFile(travel.From("tree/._x")));
        EXPECT_EQ("data", TextOf(travel.From("tree/x")));
        EXPECT_THAT(NamesIn(travel.To("tree")), ElementsAre("x"));
        EXPECT_EQ("data", TextOf(travel.To("tree/x")));

        EXPECT_THAT(
            travel.Run({"mv", travel.From("tree/._x"), travel.From("tree/x"), travel.target()}),
            Failed(1, travel.From("tree/x") + ": '" + travel.To("._x") +
                          "', just made, would be its metadata there; give that another "
                          "name"));
        EXPECT_THAT(NamesIn(travel.From("tree")), ElementsAre("x"));
        EXPECT_EQ(apple_double, ReadFile(travel.To("._x")));
        EXPECT_FALSE(Exists(travel.To("x")));
    }
}

TEST_F(MvTest, AnInterruptLeavesEveryObjectWholeInOnePlace) {
    const SecondVolume second;
    MAVOEA_SKIP_WITHOUT_SECOND(second);
    const Travel travel(kEaDirectory, kFileEa, second.path());
    for (const char* name : {"a", "b", "c"}) {
        travel.MakeFile(travel.From(name), std::string("new ") + name);
        travel.GiveMetadata(travel.From(name), name);
    }
    travel.MakeFile(travel.To("b"), "old");
    RunningTool tool(travel.WithVolumes(
        {"mv", "-i", travel.From("a"), travel.From("b"), travel.From("c"), travel.target()}));
    ASSERT_TRUE(tool.WaitFor("overwrite '" + travel.To("b") + "'? "));
    tool.Signal(SIGINT);
    EXPECT_EQ(130, tool.Wait());
    EXPECT_THAT(tool.said(), HasSubstr("interrupted: 1 moved"));
    EXPECT_EQ("new a", TextOf(travel.To("a")));
    travel.ExpectMetadata(travel.To("a"), "a");
    EXPECT_EQ("old", TextOf(travel.To("b")));
    EXPECT_THAT(Travel::ObjectsIn(travel.source()), ElementsAre("b", "c"));
    travel.ExpectMetadata(travel.From("b"), "b");
    travel.ExpectMetadata(travel.From("c"), "c");
    EXPECT_THAT(Travel::ObjectsIn(travel.target()), ElementsAre("a", "b"));
}

TEST_F(MvTest, VerboseAndJsonSayWhatWasMoved) {
    travel_.MakeFile(travel_.From("a"));
    EXPECT_EQ("renamed '" + travel_.From("a") + "' -> '" + travel_.To("a") + "'\n",
              travel_.Run({"mv", "-v", travel_.From("a"), travel_.target()}).out);
    const auto json = travel_.Run({"--json", "mv", travel_.To("a"), travel_.source()}).json();
    EXPECT_EQ("moving", json["task"]);
    EXPECT_EQ(1, json["done"]);
    EXPECT_EQ(0, json["failed"]);
}

}  // namespace
}  // namespace mavoea::test

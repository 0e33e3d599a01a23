// Dry runs of mv: renames and moves by copying, what stays because not all of it arrives, and what
// the steps before have moved away.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <optional>

#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/rehearsal.h"
#include "tests/tool/ways.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;

std::string Renamed(const std::string& from, const std::string& to) {
    return "renamed " + Arrow(from, to);
}
std::string Copied(const std::string& from, const std::string& to) {
    return "copied " + Arrow(from, to);
}
std::string Created(const std::string& path) { return "created directory '" + path + "'\n"; }
std::string Removed(const std::string& path) { return "removed '" + path + "'\n"; }
std::string RemovedDirectory(const std::string& path) {
    return "removed directory '" + path + "'\n";
}

class DryRunMoveTest : public WayTest<Rehearsal> {
 protected:
    // Whether directories and files are renamed: not to another file system or kind of volume.
    static bool Renames() { return !GetParam().across && GetParam().from == GetParam().to; }

    Rehearsal& both() { return places(); }
    const Rehearsal& both() const { return places(); }
    std::string From(const std::string& name) const { return both().From(name); }
    std::string To(const std::string& name) const { return both().To(name); }
    ToolResult Expect(const Arguments& arguments) const { return both().Expect(arguments); }
    std::string Lines(const Arguments& arguments) const { return both().Lines(arguments); }

    void Make(const std::string& path, const std::string& data = "data") const {
        both().travel().MakeFile(path, data);
    }
    void MakeWithMetadata(const std::string& path, const std::string& colour = "blue") const {
        Make(path);
        both().travel().GiveMetadata(path, colour);
    }
    void MakeTree(const std::string& top) const {
        for (const char* const name : {"", "/sub", "/sub/deep", "/empty"}) MakeDir(top + name);
        for (const char* const name : {"/a", "/sub/b", "/sub/deep/c"}) MakeWithMetadata(top + name);
        both().travel().GiveMetadata(top + "/sub", "white");
    }
};

std::vector<Way> SomeWays() {
    std::vector<Way> ways;
    for (const int type : Types({kAppleDouble, kEaDirectory, kFileEa, kXattr, kSamba})) {
        ways.push_back({type, type, false});
        ways.push_back({type, type, true});
    }
    ways.push_back({kEaDirectory, kAppleDouble, false});
    ways.push_back({kXattr, kSamba, true});
    return ways;
}
INSTANTIATE_TEST_SUITE_P(SomeWays, DryRunMoveTest, ::testing::ValuesIn(Thinned(SomeWays())),
                         NameOf);

TEST_P(DryRunMoveTest, NamesOfOneFileGoOneAfterTheOther) {
    MakeWithMetadata(From("one"));
    MakeDir(From("d"));
    ASSERT_EQ(0, link(From("one").c_str(), From("d/two").c_str()));
    MakeDir(To("t"));
    Expect({"mv", "-v", From("one"), From("d"), To("t")});
}

// ---- One by one ---------------------------------------------------------------------------------

TEST_P(DryRunMoveTest, FilesAreRenamedOrCopiedAsForeseen) {
    MakeWithMetadata(From("a"));
    MakeWithMetadata(From("b"), "red");
    const auto lines = [&](const std::string& from, const std::string& to) {
        return Renames() ? Renamed(from, to) : Copied(from, to) + Removed(from);
    };
    EXPECT_EQ(lines(From("a"), To("a")), Lines({"mv", From("a"), To("")}));
    EXPECT_FALSE(Exists(From("a")));
    // Over what is there, and back.
    EXPECT_EQ(lines(From("b"), To("a")), Lines({"mv", From("b"), To("a")}));
    EXPECT_EQ(Renamed(To("a"), To("c")), Lines({"mv", To("a"), To("c")}));
    EXPECT_EQ(lines(To("c"), From("c")), Lines({"mv", "-T", To("c"), From("c")}));
    MakeWithMetadata(To("c"));
    Expect({"mv", "-n", From("c"), To("c")});
    Expect({"mv", "-u", From("c"), To("c")});
    Make(From("c"), "new");
    both().Expect({"mv", "-i", From("c"), To("c")}, "y\n");
    EXPECT_FALSE(Exists(From("c")));
}

TEST_P(DryRunMoveTest, TreesAreRenamedOrCopiedAndRemovedAsForeseen) {
    MakeTree(From("tree"));
    const std::string from = From("tree");
    const std::string to = To("tree");
    const ToolResult said = Expect({"mv", from, To("")});
    EXPECT_EQ(0, said.status);
    if (Renames()) {
        EXPECT_EQ(Renamed(from, to), said.out);
    } else {
        EXPECT_THAT(said.out, HasSubstr(Created(to)));
        EXPECT_THAT(said.out, HasSubstr(Copied(from + "/sub/deep/c", to + "/sub/deep/c")));
        EXPECT_THAT(said.out, HasSubstr(Removed(from + "/sub/deep/c")));
        EXPECT_THAT(said.out, HasSubstr(RemovedDirectory(from)));
    }
    EXPECT_FALSE(Exists(from));
    // Over an empty directory, and not over one that is not.
    MakeDir(from);
    MakeDir(from + "/sub");
    Make(from + "/sub/x");
    EXPECT_EQ(1, Expect({"mv", from, To("")}).status);
    EXPECT_EQ(0, Expect({"mv", "-T", from, To("tree/empty")}).status);
    EXPECT_TRUE(Exists(To("tree/empty/sub/x")));
    Expect({"mv", to, From("back")});
    Expect({"mv", "-b", From("back/sub"), To("")});
}

TEST_P(DryRunMoveTest, SpecialFilesAndLinksGoAsForeseen) {
    MakeDir(From("tree"));
    for (const std::string& top : {From(""), From("tree/")}) {
        ASSERT_EQ(0, mkfifo((top + "fifo").c_str(), 0600));
        ASSERT_EQ(0, symlink("fifo", (top + "link").c_str()));
        ASSERT_EQ(0, symlink("nowhere", (top + "dangling").c_str()));
    }
    MakeWithMetadata(From("tree/first"));
    MakeDir(From("tree/sub"));
    MakeWithMetadata(From("tree/sub/deep"), "red");
    ASSERT_EQ(0, link(From("tree/first").c_str(), From("tree/sub/second").c_str()));
    ASSERT_EQ(0, link(From("tree/sub/deep").c_str(), From("tree/third").c_str()));
    ASSERT_EQ(0, link(From("tree/sub/deep").c_str(), From("fourth").c_str()));
    Expect({"mv", From("fifo"), From("link"), From("dangling"), To("")});
    ASSERT_EQ(0, symlink("fifo", From("link").c_str()));
    Expect({"mv", From("link"), To("dangling")});
    Expect({"mv", From("tree"), From("fourth"), To("")});
    EXPECT_TRUE(Exists(To("tree/third")));
}

// ---- What steps before have done ----------------------------------------------------------------

TEST_P(DryRunMoveTest, WhatHasBeenMovedAwayIsForeseenToBeMissing) {
    const auto missing = [](const std::string& path) {
        return "mavoea: cannot stat '" + path + "': No such file or directory; check the path\n";
    };
    MakeWithMetadata(From("a"));
    MakeDir(To("d"));
    const ToolResult twice = Expect({"mv", From("a"), From("a"), To("d")});
    // What is copied goes at the end only.
    EXPECT_EQ(Renames()
                  ? missing(From("a"))
                  : "mavoea: warning: source file '" + From("a") + "' specified more than once\n",
              twice.err);
    EXPECT_EQ(Renames() ? 1 : 0, twice.status);
    // With the directory that it is in.
    MakeTree(From("tree"));
    const ToolResult below =
        Expect({"mv", From("tree"), From("tree/a"), From("tree/sub/b"), To("d")});
    EXPECT_EQ(missing(From("tree/a")) + missing(From("tree/sub/b")), below.err);
    EXPECT_EQ(1, below.status);
    MakeTree(From("tree"));
    ASSERT_EQ(0, both().travel().Run({"rm", "-r", To("d")}).status);
    MakeDir(To("d"));
    Expect({"mv", "-n", From("tree"), From("tree/a"), To("d")});
    MakeTree(From("tree"));
    Expect({"mv", "-u", "-b", From("tree/a"), From("tree/sub/deep"), From("tree"),
            From("tree/empty"), To("d")});
    // Into what has been moved.
    MakeTree(From("one"));
    Expect({"mv", From("one"), From("one/.."), To("d/one")});
    Expect({"mv", From("none"), To("d")});
}

TEST_P(DryRunMoveTest, NothingIsMovedOverWhatHasJustCome) {
    for (const char* const one : {"one", "two"}) {
        MakeDir(From(one));
        MakeDir(From(one) + "/sub");
        MakeWithMetadata(From(one) + "/x", one);
        MakeWithMetadata(From(one) + "/sub/y", one);
    }
    MakeDir(To("d"));
    const ToolResult said = Expect({"mv", From("one/x"), From("two/x"), To("d")});
    EXPECT_EQ("mavoea: will not overwrite just-created '" + To("d/x") + "' with '" + From("two/x") +
                  "'; give it another name\n",
              said.err);
    EXPECT_EQ(1, said.status);
    Expect({"mv", "-b", From("two/x"), To("d")});
    Expect({"mv", From("one/sub"), From("two/sub"), To("d")});
    Expect({"mv", "--backup=numbered", From("two/sub"), From("one"), From("two"), To("d")});
    Make(From("x~"));
    Make(From("x"));
    MakeWithMetadata(To("d/x"));
    Expect({"mv", "-b", "-t", To("d"), From("x~"), From("x")});
}

TEST_P(DryRunMoveTest, BackupsAreMadeAsForeseen) {
    for (const char* const one : {"one", "two", "three"}) {
        MakeDir(From(one));
        MakeWithMetadata(From(one) + "/x", one);
    }
    MakeDir(To("d"));
    MakeWithMetadata(To("d/x"), "old");
    const std::string lines =
        Lines({"mv", "--backup=numbered", From("one/x"), From("two/x"), From("three/x"), To("d")});
    for (const char* const number : {"1", "2", "3"}) {
        const std::string backup = To("d/x.~") + number + "~";
        EXPECT_TRUE(Exists(backup));
        if (Renames()) {
            EXPECT_THAT(lines, HasSubstr(" (backup: '" + backup + "')\n"));
        }
    }
    Expect({"mv", "-b", "-T", From("one"), To("d")});
    Expect({"mv", "-S", ".old", "--backup=simple", "-T", From("two"), To("d")});
    Make(To("file"));
    Expect({"mv", "-b", "-T", From("three"), To("file")});
    EXPECT_TRUE(std::filesystem::is_directory(To("file")));
}

TEST_P(DryRunMoveTest, WhatIsNewerIsForeseenByTheTimesThatMovedFilesKeep) {
    both().keeps_times = true;
    const auto make = [&](const std::string& path, time_t time) {
        Make(path);
        const timespec times[2] = {{time, 0}, {time, 0}};
        ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, 0)) << path;
    };
    for (const char* const one : {"one", "two", "three"}) MakeDir(From(one));
    const auto make_all = [&] {
        make(From("one/x"), 1000);
        make(From("two/x"), 3000);
        make(From("three/x"), 2000);
    };
    for (const Arguments& options :
         std::vector<Arguments>{{"-u", "--backup=numbered"}, {"-u", "-b"}, {"-u"}}) {
        make_all();
        const std::string to = To("d" + options.back());
        MakeDir(to);
        Arguments words = {"mv"};
        words.insert(words.end(), options.begin(), options.end());
        words.insert(words.end(), {From("one/x"), From("two/x"), From("three/x"), to});
        Expect(words);
        // The last one is older than what has come.
        EXPECT_TRUE(Exists(From("three/x")));
    }
    // A directory keeps its time as well.
    MakeDir(From("directory"));
    MakeDir(From("directory/x"));
    const timespec old[2] = {{1000, 0}, {1000, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, From("directory/x").c_str(), old, 0));
    MakeDir(To("d"));
    Expect({"mv", "-u", "-b", From("directory/x"), From("three/x"), To("d")});
    make_all();
    make(To("x"), 1500);
    EXPECT_EQ("", Lines({"mv", "-u", From("one/x"), To("")}));
    EXPECT_THAT(Lines({"mv", "-u", From("two/x"), To("")}),
                HasSubstr(Arrow(From("two/x"), To("x"))));
}

// ---- In the way ---------------------------------------------------------------------------------

TEST_P(DryRunMoveTest, WhatIsOfAnotherTypeIsForeseenToStay) {
    MakeTree(From("tree"));
    MakeWithMetadata(From("file"));
    MakeTree(To("tree"));
    MakeDir(To("file"));
    Make(To("plain"));
    EXPECT_EQ(1, Expect({"mv", From("tree"), To("plain")}).status);
    EXPECT_EQ(1, Expect({"mv", "-T", From("file"), To("tree")}).status);
    EXPECT_EQ(1, Expect({"mv", "-T", From("file"), To("file")}).status);
    EXPECT_EQ(1, Expect({"mv", From("tree"), To("")}).status);
    EXPECT_EQ(1, Expect({"mv", "-T", From("tree"), To("tree")}).status);
    EXPECT_EQ(1, Expect({"mv", From("tree"), From("tree/sub")}).status);
    EXPECT_EQ(1, Expect({"mv", From("tree"), From("tree/new")}).status);
    EXPECT_EQ(1, Expect({"mv", From("file"), From("file")}).status);
    EXPECT_EQ(1, Expect({"mv", From("tree/."), To("")}).status);
    EXPECT_EQ(1, Expect({"mv", From("file"), To("none/file")}).status);
    EXPECT_EQ(1, Expect({"mv", From("file"), To("none/")}).status);
    EXPECT_EQ(1, Expect({"mv", From("file") + "/", To("")}).status);
    EXPECT_EQ(1, Expect({"mv", From("file"), From("tree"), To("plain")}).status);
    Expect({"mv", "-f", From("file"), From("tree"), To("")});
    Expect({"mv", From("tree") + "/", To("new") + "/"});
}

TEST_P(DryRunMoveTest, WhatIsOfNoObjectInTheWayIsForeseen) {
    const Bytes orphan = AppleDoubleOf({{kFinderInfoEntry, Repeat(1, 32)}});
    for (const char* const d : {"d", "e", "f"}) MakeDir(To(d));
    WriteFile(To("d/._a"), orphan);
    WriteFile(To("d/._b"), orphan);
    PutStream(To("d/tree"), Ascii("not a stream"));
    MakeDir(To("e/._a"));
    WriteFile(To("e/._a/inside"), Ascii("data"));
    WriteFile(To("e/@eaDir"), Ascii("no directory"));
    PutKind(To("f/a"), "MAVOPHOTO", Ascii("of another service"));
    MakeDir(To("f/@eaDir/a@MavoEAStream"));
    for (const char* const d : {"d", "e", "f"}) {
        SCOPED_TRACE(d);
        if (!Exists(From("a"))) MakeWithMetadata(From("a"));
        if (!Exists(From("b"))) Make(From("b"));
        MakeTree(From("tree"));
        Expect({"mv", From("a"), To(d)});
        Expect({"mv", From("b"), To(d)});
        Expect({"mv", From("tree"), To(d)});
    }
}

TEST_P(DryRunMoveTest, OrphansInATreeAreForeseenToGoOrToStay) {
    MakeTree(From("tree"));
    Make(From("tree/._gone"), "whose?");
    Make(From("tree/._a"), "no AppleDouble file");
    WriteFile(From("tree/._missing"), AppleDoubleOf({{kFinderInfoEntry, Repeat(1, 32)}}));
    WriteFile(From("tree/sub/._b"), AppleDoubleOf({{kFinderInfoEntry, Repeat(1, 32)}}));
    PutKind(From("tree/a"), "MAVOPHOTO", Ascii("of another service"));
    PutKind(From("tree/gone"), "MAVOPHOTO", Ascii("of no object"));
    PutLegacy(From("tree/sub/b"), "colour", Ascii("blue"));
    Expect({"mv", From("tree/sub/b"), From("tree/._gone"), To("")});
    Expect({"mv", From("tree"), To("")});
    Expect({"mv", From("tree"), To("second")});
}

TEST_P(DryRunMoveTest, LongNamesAreForeseenToHaveNoRoom) {
    MakeWithMetadata(From("a"));
    MakeWithMetadata(From("b"));
    const std::string whole(255, 'n');
    EXPECT_EQ(1, Expect({"mv", From("a"), To(std::string(256, 'n'))}).status);
    Expect({"mv", From("a"), To(whole)});
    Make(To(whole));
    Expect({"mv", "-b", From("b"), To(whole)});
    // The names of their metadata would be one.
    MakeDir(From("tree"));
    for (const char* const end : {"1", "2"}) Make(From("tree/" + std::string(246, 'm') + end));
    (void)both().travel().Run({"set", From("tree/" + std::string(246, 'm') + "1"), Colour(), "x"});
    Expect({"mv", From("tree"), To("")});
}

// ---- Rights -------------------------------------------------------------------------------------

TEST_P(DryRunMoveTest, WhatAnotherUserMayNotDoIsForeseen) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS("/tmp");
    constexpr uid_t kUser = 54321;
    const auto give = [](const std::string& path, mode_t mode, uid_t user) {
        ASSERT_EQ(0, chmod(path.c_str(), mode)) << path;
        ASSERT_EQ(0, lchown(path.c_str(), user, user)) << path;
    };
    give(both().travel().dir().path(), 0755, 0);
    give(std::filesystem::path(both().travel().target()).parent_path(), 0755, 0);
    give(From(""), 0755, 0);
    give(To(""), 0755, 0);
    MakeDir(From("own"));
    MakeDir(From("own/closed"));
    MakeDir(From("own/tree"));
    for (const char* const name :
         {"own/mine", "own/secret", "own/tree/a", "own/tree/secret", "own/closed/x", "others"}) {
        Make(From(name));
    }
    MakeDir(To("own"));
    MakeDir(To("sticky"));
    Make(To("sticky/mine"));
    give(To("own"), 0755, kUser);
    give(To("sticky"), 01777, 0);
    give(To("sticky/mine"), 0666, 0);
    give(From("own"), 0755, kUser);
    give(From("own/closed"), 0700, 0);
    give(From("own/tree"), 0755, kUser);
    give(From("own/mine"), 0644, kUser);
    give(From("own/tree/a"), 0644, kUser);
    give(From("own/secret"), 0600, 0);
    give(From("own/tree/secret"), 0600, 0);
    const auto expect = [&](const Arguments& words) { return both().ExpectOf(kUser, words); };
    EXPECT_EQ(1, expect({"mv", From("own/mine"), To("")}).status);
    EXPECT_EQ(1, expect({"mv", From("own/mine"), To("sticky")}).status);
    EXPECT_EQ(1, expect({"mv", From("others"), To("own")}).status);
    EXPECT_EQ(1, expect({"mv", From("own/tree"), To("")}).status);
    EXPECT_EQ(1, expect({"mv", From("own"), To("own")}).status);
    expect({"mv", From("own/secret"), To("own")});
    expect({"mv", From("own/closed"), To("own")});
    expect({"mv", From("own/tree"), To("own")});
    EXPECT_EQ(0, expect({"mv", From("own/mine"), To("own")}).status);
}

// ---- Every pair of kinds ------------------------------------------------------------------------

class DryRunLossTest : public DryRunMoveTest {};

std::vector<Way> AllPairs() {
    std::vector<Way> ways;
    for (const int from : Types({kAppleDouble, kEaDirectory, kFileEa, kXattr, kSamba})) {
        for (const int to : Types({kAppleDouble, kEaDirectory, kFileEa, kXattr, kSamba})) {
            ways.push_back({from, to, false});
        }
    }
    return ways;
}
INSTANTIATE_TEST_SUITE_P(EveryPair, DryRunLossTest, ::testing::ValuesIn(Thinned(AllPairs())),
                         NameOf);

TEST_P(DryRunLossTest, WhatDoesNotArriveIsForeseenAndKeepsTheSource) {
    const std::string a = From("a");
    const auto make = [&](const std::string& path) {
        Make(path);
        // Each as far as the source's kind has a place for it.
        (void)both().travel().Run({"set", path, Colour(), "blue"});
        (void)both().travel().Run({"set", path, "user.large"}, std::string(3000, 'x'));
        (void)both().travel().Run({"set", path, "plain name", "1"});
        (void)both().travel().Run({"set", path, kFinderInfoName, "--hex", FinderInfoDigits()});
        (void)both().travel().Run({"set", path, kForkName, "the fork"});
        (void)both().travel().Run({"set-info", path, "--comment", "hello"});
        (void)both().travel().Run({"set-info", path, "--created", "2024-05-01T09:30:00Z"});
        EXPECT_EQ(0, both().travel().Run({"lock", path}).status);
    };
    make(a);
    const ToolResult copied = Expect({"cp", a, To("copy")});
    Expect({"cp", "-a", "--atomic", a, To("copy")});
    const ToolResult moved = Expect({"mv", a, To("moved")});
    EXPECT_EQ(moved.status != 0, Exists(a));
    if (GetParam().to == kXattr && GetParam().from != kXattr) {
        // The file systems of tests take no attributes of other name spaces.
        for (const ToolResult& said : {copied, moved}) {
            EXPECT_EQ(2, said.status);
            EXPECT_THAT(said.err, HasSubstr("not all of its metadata arrived at"));
            EXPECT_THAT(said.err, HasSubstr("Finder info"));
        }
        EXPECT_TRUE(Exists(a));
    }
    make(a);
    Expect({"mv", "--allow-loss", a, To("allowed")});
    MakeDir(From("tree"));
    make(From("tree/a"));
    Make(From("tree/plain"));
    const std::string type = WordOfType(GetParam().to);
    Expect({"convert", "--to", type, "-r", From("tree"), To("converted")});
    Expect({"convert", "--to", type, "-r", From("tree"), To("converted")});
    Expect({"convert", "--to", type, "-r", "--json", From("tree"), To("third")});
    Expect({"mv", From("tree"), To("")});
}

// ---- Many and deep ------------------------------------------------------------------------------

TEST(DryRunLargeMoveTest, ThousandsOfFilesAndHundredsOfLevelsAreForeseen) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const SecondVolume second;
    MAVOEA_SKIP_WITHOUT_SECOND(second);
    const Rehearsal both(kEaDirectory, kEaDirectory, second.path());
    std::string path = both.From("tree");
    MakeDir(path);
    for (int i = 0; i < 2000; ++i) {
        const std::string file = path + "/f" + std::to_string(i);
        both.travel().MakeFile(file);
        if (i % 50 == 0) PutStream(file, StreamImage{.attributes = {{"a", Ascii("1")}}}.Build());
    }
    for (int level = 0; level < 300; ++level) MakeDir(path += "/d");
    const std::string lines = both.Lines({"mv", both.From("tree"), both.To("")});
    // A line for each, and one for its removal.
    EXPECT_EQ(2 * 2301, std::count(lines.begin(), lines.end(), '\n'));
    EXPECT_THAT(lines, EndsWith(RemovedDirectory(both.From("tree"))));
    EXPECT_THAT(NamesIn(both.From("")), ElementsAre());
    both.Lines({"mv", both.To("tree"), both.To("renamed")});
}

}  // namespace
}  // namespace mavoea::test

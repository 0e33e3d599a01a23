// Metadata whose object is gone, found and removed through the tool.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/snapshot.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

const Bytes kAppleDouble = Hex("00 05 16 07  00 02 00 00  00*16  00 00");

// A shared directory, and what should be left of it.
class CleanTest : public ::testing::Test {
 protected:
    ObjectFiles Files(const std::string& name) const { return {dir_.path(), name}; }
    std::string EaFile(const std::string& name) const { return dir_ / ("@eaDir/" + name); }

    void MakeEaFile(const std::string& name) const {
        MakeDir(dir_ / "@eaDir");
        WriteFile(EaFile(name), Ascii(name));
    }
    void MakeObject(const std::string& name) const { Files(name).MakeObject(); }

    ToolResult Clean(Arguments arguments = {}) const {
        arguments.insert(arguments.begin(), {"clean", "--wait", "0"});
        arguments.push_back(dir_.path());
        const bool removes =
            std::find(arguments.begin(), arguments.end(), "--yes") != arguments.end();
        return removes ? CleanAsForeseen(arguments) : RunTool(arguments);
    }

    // By a dry run, which changes nothing.
    ToolResult CleanAsForeseen(const Arguments& arguments) const {
        Arguments dry = arguments;
        dry.emplace_back("--dry-run");
        const Snapshot before = TakeSnapshot(dir_.path());
        const ToolResult said = RunTool(dry);
        // Access times stay where the user may have that.
        std::set<std::string> ignored;
        if (geteuid() != 0) ignored.insert("atime");
        EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path()), ignored), IsEmpty());
        const ToolResult done = RunTool(arguments);
        EXPECT_EQ(done.out, said.out);
        EXPECT_EQ(done.err, said.err);
        EXPECT_EQ(done.status, said.status);
        return done;
    }

    // What a run would remove, without what it would keep; paths from the directory on.
    std::vector<std::string> Listed(Arguments arguments = {}) const {
        const std::vector<std::string> before = Tree(dir_.path());
        arguments.insert(arguments.begin(), "--json");
        const ToolResult result = Clean(arguments);
        EXPECT_THAT(result, Succeeded());
        EXPECT_EQ(before, Tree(dir_.path())) << "it was only to be listed";
        std::vector<std::string> paths;
        const nlohmann::json json = result.json();
        for (const auto& found : json["found"]) {
            EXPECT_EQ(false, found["removed"]);
            if (found["kept"] == false) paths.push_back(Shown(found));
        }
        EXPECT_EQ(paths.size(), result.json()["dangling"]);
        return paths;
    }

    // The same for what is removed, and is gone.
    std::vector<std::string> Removed(Arguments arguments = {}) const {
        arguments.insert(arguments.begin(), {"--json", "--yes"});
        const ToolResult result = Clean(arguments);
        EXPECT_THAT(result, Succeeded());
        std::vector<std::string> paths;
        const nlohmann::json json = result.json();
        for (const auto& found : json["found"]) {
            EXPECT_NE(found["kept"], found["removed"]);
            if (found["removed"] == false) continue;
            paths.push_back(Shown(found));
            EXPECT_FALSE(Exists(dir_ / paths.back()));
        }
        EXPECT_EQ(paths.size(), result.json()["removed"]);
        EXPECT_EQ(0, result.json()["dangling"]);
        return paths;
    }

    std::string Shown(const nlohmann::json& found) const {
        std::string path = found["path"];
        if (found.contains("pathHex")) {
            const Bytes bytes = Hex(std::string(found["pathHex"]));
            path.assign(bytes.begin(), bytes.end());
        }
        return path.substr(dir_.path().size() + 1);
    }

    TempDir dir_;
};

// ---- What dangles -------------------------------------------------------------------------------

// Promise: "What may be left over: `@eaDir` or"
// Promise: "The tool: `rm`"
TEST_F(CleanTest, EveryKindOfMetadataIsListedWithItsPathAndReasonAndThenRemoved) {
    MakeObject("here");
    Files("gone").MakeStream();
    Files("gone").MakeResource();
    Files("gone").MakeLegacy("MAVO:Resource");
    Files("gone").MakeLegacy("colour");
    MakeEaFile("gone@MavoResourceTmp");
    WriteFile(dir_ / "._gone", kAppleDouble);
    const std::string at = dir_.path() + '/';
    const std::vector<std::string> lines = {
        at + "._gone: AppleDouble file, its object is gone",
        at + "@eaDir/gone: legacy folder, its object is gone",
        at + "@eaDir/gone@MavoEAStream: EA stream, its object is gone",
        at + "@eaDir/gone@MavoResource: resource file, its object is gone",
        at + "@eaDir/gone@MavoResourceTmp: unfinished copy of a resource file, its object is gone",
        at + "@eaDir: EA directory, nothing is left in it",
    };
    std::string listed;
    std::string removed;
    for (const std::string& line : lines) {
        listed += line + '\n';
        removed += line + "; removed\n";
    }

    const std::vector<std::string> before = Tree(dir_.path());
    const ToolResult list = Clean();
    EXPECT_THAT(list, Succeeded());
    EXPECT_EQ(listed + "6 to be removed with --yes, 0 kept, 0 failed\n", list.out);
    EXPECT_EQ(before, Tree(dir_.path()));

    const ToolResult result = Clean({"--yes"});
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ(removed + "6 removed, 0 kept, 0 failed\n", result.out);
    EXPECT_THAT(Tree(dir_.path()), ElementsAre("here"));

    EXPECT_EQ("0 to be removed with --yes, 0 kept, 0 failed\n", Clean().out);
    EXPECT_EQ("0 removed, 0 kept, 0 failed\n", Clean({"--yes"}).out);
}

TEST_F(CleanTest, JsonHasEveryFindingAndTheCounts) {
    MakeObject("here");
    MakeEaFile("gone@MavoEAStream");
    MakeEaFile("gone@Thumbnail");
    const ToolResult result = Clean({"--json"});
    EXPECT_THAT(result, Succeeded());
    const auto json = result.json();
    ASSERT_EQ(2U, json["found"].size());
    EXPECT_EQ(EaFile("gone@MavoEAStream"), json["found"][0]["path"]);
    EXPECT_EQ("stream", json["found"][0]["kind"]);
    EXPECT_EQ("its object is gone", json["found"][0]["reason"]);
    EXPECT_EQ(false, json["found"][0]["kept"]);
    EXPECT_EQ(false, json["found"][0]["removed"]);
    EXPECT_EQ("other", json["found"][1]["kind"]);
    EXPECT_EQ(true, json["found"][1]["kept"]);
    EXPECT_EQ(1, json["dangling"]);
    EXPECT_EQ(0, json["removed"]);
    EXPECT_EQ(1, json["kept"]);
    EXPECT_EQ(0, json["failed"]);
    EXPECT_TRUE(json["failures"].empty());
}

TEST_F(CleanTest, NamesThatTripUpOthersAreTakenAsTheyAre) {
    // One half of the objects is there.
    const std::vector<std::string> names = OddNames();
    std::vector<std::string> expected;
    for (const std::string& name : names) {
        for (const char* prefix : {"is ", "was "}) {
            const ObjectFiles files = Files(prefix + name);
            files.MakeStream();
            files.MakeResource();
            files.MakeLegacy("colour");
            WriteFile(files.sidecar(), kAppleDouble);
            if (prefix == std::string("is ")) {
                files.MakeObject();
                continue;
            }
            for (const std::string& path :
                 {files.stream(), files.resource(), files.folder(), files.sidecar()}) {
                expected.push_back(path.substr(dir_.path().size() + 1));
            }
        }
    }
    EXPECT_THAT(Listed(), ::testing::UnorderedElementsAreArray(expected));
    EXPECT_THAT(Removed(), ::testing::UnorderedElementsAreArray(expected));
    for (const std::string& name : names) {
        const ObjectFiles files = Files("is " + name);
        for (const std::string& path :
             {files.stream(), files.resource(), files.folder() + "/colour", files.sidecar()}) {
            EXPECT_TRUE(Exists(path)) << path;
        }
    }
    EXPECT_EQ("0 to be removed with --yes, 0 kept, 0 failed\n", Clean().out);
}

TEST_F(CleanTest, ALineHasOnePathWhateverIsInItsName) {
    MakeObject("here");
    MakeEaFile("two\nlines\x1b[31m@MavoEAStream");
    EXPECT_THAT(Clean().out, HasSubstr("@eaDir/two\\x0Alines\\x1B[31m@MavoEAStream: EA stream"));
}

TEST_F(CleanTest, AnythingThatIsThereIsAnObject) {
    MakeDir(dir_ / "directory");
    ASSERT_EQ(0, symlink("nowhere", (dir_ / "dangling link").c_str()));
    ASSERT_EQ(0, mkfifo((dir_ / "pipe").c_str(), 0600));
    MakeObject(".hidden");
    for (const char* name : {"directory", "dangling link", "pipe", ".hidden", "@eaDir"}) {
        MakeEaFile(std::string(name) + "@MavoEAStream");
        MakeEaFile(std::string(name) + "@MavoResource");
    }
    Files("directory").MakeLegacy("colour");
    WriteFile(dir_ / "._directory", kAppleDouble);
    WriteFile(dir_ / "._dangling link", kAppleDouble);
    EXPECT_THAT(Listed(), IsEmpty());
    EXPECT_THAT(Removed(), IsEmpty());
}

TEST_F(CleanTest, AnObjectIsNotTakenForAnotherWhoseNameIsPartOfIt) {
    MakeObject("a@b");
    for (const char* name : {"a", "b", "a@b", "a@b@c"}) Files(name).MakeStream();
    EXPECT_THAT(Removed(), ElementsAre("@eaDir/a@MavoEAStream", "@eaDir/a@b@c@MavoEAStream",
                                       "@eaDir/b@MavoEAStream"));
    EXPECT_TRUE(Exists(Files("a@b").stream()));
}

// ---- Long names ---------------------------------------------------------------------------------

// 250 bytes, which metadata files shorten to 242: 241 of them and the check character, which is at
// (9 * 'x') % 60 = 0 of its table.
const std::string kLongName = std::string(241, 'a') + std::string(9, 'x');
const std::string kShortName = std::string(241, 'a') + '1';

TEST_F(CleanTest, AShortenedNameBelongsToTheLongOne) {
    MakeObject(kLongName);
    MakeEaFile(kShortName + "@MavoEAStream");
    MakeEaFile(kShortName + "@MavoResource");
    MakeEaFile(kShortName + "@Other");
    EXPECT_THAT(Listed(), IsEmpty());
    EXPECT_THAT(Removed({"--all"}), IsEmpty());

    ASSERT_EQ(0, unlink((dir_ / kLongName).c_str()));
    MakeObject("here");
    EXPECT_THAT(Removed(), ElementsAre("@eaDir/" + kShortName + "@MavoEAStream",
                                       "@eaDir/" + kShortName + "@MavoResource"));
    EXPECT_THAT(NamesIn(dir_ / "@eaDir"), ElementsAre(kShortName + "@Other"));
}

TEST_F(CleanTest, AShortenedNameKeepsItsExtension) {
    // 247 bytes: the bytes of "bc.txt" add up to 595, and 595 % 60 = 55 in the table is '&'.
    MakeObject(std::string(241, 'a') + "bc.txt");
    MakeEaFile(std::string(237, 'a') + "&.txt@MavoEAStream");
    MakeEaFile(std::string(237, 'a') + "x.txt@MavoEAStream");
    EXPECT_THAT(Removed(), ElementsAre("@eaDir/" + std::string(237, 'a') + "x.txt@MavoEAStream"));
}

TEST_F(CleanTest, ANameOfTheLongestLengthThatIsNotShortenedIsItself) {
    const std::string name(242, 'b');
    MakeObject(name);
    Files(name).MakeStream();
    Files(std::string(242, 'c')).MakeStream();
    EXPECT_THAT(Removed(), ElementsAre("@eaDir/" + std::string(242, 'c') + "@MavoEAStream"));
}

TEST_F(CleanTest, ALegacyFolderHasTheWholeName) {
    MakeObject(kLongName);
    Files(kLongName).MakeLegacy("colour");
    Files(std::string(250, 'z')).MakeLegacy("colour");
    EXPECT_THAT(Removed(), ElementsAre("@eaDir/" + std::string(250, 'z')));
}

// ---- AppleDouble files --------------------------------------------------------------------------

TEST_F(CleanTest, OnlyAppleDoubleFilesWithoutACompanionGo) {
    MakeObject("here");
    WriteFile(dir_ / "._here", kAppleDouble);
    WriteFile(dir_ / "._gone", kAppleDouble);
    WriteFile(dir_ / "._", kAppleDouble);
    WriteFile(dir_ / "._text", Ascii("not what its name says"));
    WriteFile(dir_ / "._single", Hex("00 05 16 00  00 02 00 00  00*16  00 00"));
    WriteFile(dir_ / "._short", Hex("00 05 16"));
    WriteFile(dir_ / "._empty", {});
    MakeDir(dir_ / "._directory");
    ASSERT_EQ(0, symlink("._gone", (dir_ / "._link").c_str()));
    ASSERT_EQ(0, mkfifo((dir_ / "._pipe").c_str(), 0600));
    EXPECT_THAT(Listed(), ElementsAre("._", "._gone"));
    EXPECT_THAT(Removed(), ElementsAre("._", "._gone"));
}

TEST_F(CleanTest, AnAppleDoubleFileWhoseNameHadReservedCharactersBelongsToItsObject) {
    // '"' and ':' stand as U+F020 and U+F022 in the names that such files get.
    MakeObject("a\"b:c");
    WriteFile(dir_ /
                  "._a\xEF\x80\xA0"
                  "b\xEF\x80\xA2"
                  "c",
              kAppleDouble);
    WriteFile(dir_ / "._d\xEF\x80\xA0", kAppleDouble);
    EXPECT_THAT(Removed(), ElementsAre("._d\xEF\x80\xA0"));
}

TEST_F(CleanTest, WhatGoesIsNoObjectThatCouldKeepMetadata) {
    MakeObject("here");
    WriteFile(dir_ / "._gone", kAppleDouble);
    Files("._gone").MakeStream();
    EXPECT_THAT(Removed(), ElementsAre("._gone", "@eaDir/._gone@MavoEAStream", "@eaDir"));
}

// ---- Other services -----------------------------------------------------------------------------

TEST_F(CleanTest, FilesOfOtherServicesStayWhileTheirObjectIsThereWhateverIsGiven) {
    MakeObject("photo.jpg");
    MakeObject("a@b");
    for (const char* name : {"photo.jpg@Thumbnail", "a@b@Index", "a@b@c@Index", "no mark", "._x"}) {
        MakeEaFile(name);
    }
    MakeDir(EaFile("photo.jpg@Sizes"));
    WriteFile(EaFile("photo.jpg@Sizes/large"), {});
    MakeDir(EaFile("photo.jpg"));
    WriteFile(EaFile("photo.jpg/large"), {});
    const std::vector<std::string> before = Tree(dir_.path());
    EXPECT_EQ("0 removed, 0 kept, 0 failed\n", Clean({"--yes", "--all"}).out);
    EXPECT_EQ(before, Tree(dir_.path()));
}

TEST_F(CleanTest, FilesOfOtherServicesWhoseObjectIsGoneAreKeptUnlessAllIsGiven) {
    MakeObject("here");
    MakeEaFile("gone@Thumbnail");
    MakeDir(EaFile("deep"));
    MakeDir(EaFile("deep/er"));
    WriteFile(EaFile("deep/er/file"), {});
    ASSERT_EQ(0, symlink("/", EaFile("deep/er/link").c_str()));
    ASSERT_EQ(0, symlink("gone@Thumbnail", EaFile("gone@MavoEAStream").c_str()));
    const std::vector<std::string> before = Tree(dir_.path());

    const std::string at = dir_.path() + "/@eaDir/";
    const std::string kept = at + "deep: of another service, its object is gone; kept\n" + at +
                             "gone@MavoEAStream: of another service, its object is gone; kept\n" +
                             at + "gone@Thumbnail: of another service, its object is gone; kept\n";
    EXPECT_EQ(kept + "0 to be removed with --yes, 3 kept, 0 failed\n", Clean().out);
    EXPECT_EQ(kept + "0 removed, 3 kept, 0 failed\n", Clean({"--yes"}).out);
    EXPECT_EQ(before, Tree(dir_.path()));

    const auto all =
        ElementsAre("@eaDir/deep", "@eaDir/gone@MavoEAStream", "@eaDir/gone@Thumbnail", "@eaDir");
    EXPECT_THAT(Listed({"--all"}), all);
    EXPECT_THAT(Removed({"--all"}), all);
    EXPECT_TRUE(Exists("/"));
}

// ---- EA directories -----------------------------------------------------------------------------

TEST_F(CleanTest, AnEaDirectoryThatIsEmptyOrHasOnlyItsCoverGoes) {
    for (const bool covered : {false, true}) {
        MakeObject("here");
        MakeDir(dir_ / "@eaDir");
        if (covered) WriteFile(EaFile(".cover"), Ascii("cover"));
        EXPECT_EQ(dir_.path() +
                      "/@eaDir: EA directory, nothing is left in it\n"
                      "1 to be removed with --yes, 0 kept, 0 failed\n",
                  Clean().out);
        EXPECT_THAT(Removed(), ElementsAre("@eaDir"));
        EXPECT_THAT(Tree(dir_.path()), ElementsAre("here"));
    }
}

TEST_F(CleanTest, ACoverThatIsNoFileKeepsTheEaDirectory) {
    MakeObject("here");
    MakeDir(dir_ / "@eaDir");
    ASSERT_EQ(0, symlink("elsewhere", EaFile(".cover").c_str()));
    EXPECT_THAT(Removed({"--all"}), IsEmpty());
    EXPECT_TRUE(Exists(EaFile(".cover")));
}

TEST_F(CleanTest, AnEaDirectoryAloneInItsDirectoryGoesWithAllThatIsKnown) {
    Files("gone").MakeStream();
    Files("gone").MakeLegacy("colour");
    WriteFile(EaFile(".cover"), {});
    EXPECT_THAT(Clean().out, HasSubstr("/@eaDir: EA directory, its directory holds no objects\n"));
    EXPECT_THAT(Removed(), ElementsAre("@eaDir/gone", "@eaDir/gone@MavoEAStream", "@eaDir"));
    EXPECT_THAT(Tree(dir_.path()), IsEmpty());
}

TEST_F(CleanTest, AloneInItsDirectoryItStaysForWhatIsUnknownUnlessAllIsGiven) {
    Files("gone").MakeStream();
    MakeEaFile("no mark");
    MakeEaFile("gone@Thumbnail");
    EXPECT_THAT(Removed(), ElementsAre("@eaDir/gone@MavoEAStream"));
    EXPECT_THAT(NamesIn(dir_ / "@eaDir"), ElementsAre("gone@Thumbnail", "no mark"));
    EXPECT_THAT(Removed({"--all"}),
                ElementsAre("@eaDir/gone@Thumbnail", "@eaDir/no mark", "@eaDir"));
    EXPECT_THAT(Tree(dir_.path()), IsEmpty());
}

TEST_F(CleanTest, NothingElseCanBeAnEaDirectory) {
    MakeDir(dir_ / "elsewhere");
    WriteFile(dir_ / "elsewhere/gone@MavoEAStream", {});
    ASSERT_EQ(0, symlink("elsewhere", (dir_ / "@eaDir").c_str()));
    EXPECT_THAT(Removed({"--all"}), IsEmpty());
    ASSERT_EQ(0, unlink((dir_ / "@eaDir").c_str()));
    WriteFile(dir_ / "@eaDir", Ascii("a file"));
    EXPECT_THAT(Removed({"--all"}), IsEmpty());
    EXPECT_THAT(Tree(dir_.path()),
                ElementsAre("@eaDir", "elsewhere/", "elsewhere/gone@MavoEAStream"));
}

TEST_F(CleanTest, APathThatHoldsItsNameEarlierIsNotTakenForIt) {
    const std::string odd = dir_ / "my@eaDirectory";
    MakeDir(odd);
    const ObjectFiles gone = {odd, "gone"};
    gone.MakeStream();
    const ToolResult result = RunTool({"clean", "--yes", "--wait", "0", odd});
    EXPECT_THAT(result, Succeeded());
    EXPECT_THAT(Tree(dir_.path()), ElementsAre("my@eaDirectory/"));
}

// ---- Trees --------------------------------------------------------------------------------------

TEST_F(CleanTest, ATreeIsCleanedOnRequestAndNotThroughLinks) {
    const TempDir other;
    ObjectFiles{other.path(), "gone"}.MakeStream();
    WriteFile(other / "here", {});
    MakeDir(dir_ / "sub");
    MakeDir(dir_ / "sub/dir:ectory");
    MakeDir(dir_ / "@tmp");
    ASSERT_EQ(0, symlink(other.path().c_str(), (dir_ / "link").c_str()));
    for (const char* place : {"", "/sub", "/sub/dir:ectory", "/@tmp"}) {
        const std::string parent = dir_.path() + place;
        ObjectFiles{parent, "gone"}.MakeStream();
        ObjectFiles{parent, "here"}.MakeObject();
        ObjectFiles{parent, "here"}.MakeStream();
    }
    Files("sub").MakeStream();

    EXPECT_THAT(Listed(), ElementsAre("@eaDir/gone@MavoEAStream"));
    const auto all = ElementsAre("@eaDir/gone@MavoEAStream", "sub/@eaDir/gone@MavoEAStream",
                                 "sub/dir:ectory/@eaDir/gone@MavoEAStream");
    EXPECT_THAT(Listed({"-r"}), all);
    EXPECT_THAT(Removed({"-r"}), all);
    EXPECT_TRUE(Exists(Files("sub").stream()));
    EXPECT_TRUE(Exists(dir_ / "@tmp/@eaDir/gone@MavoEAStream"));
    EXPECT_TRUE(Exists(other / "@eaDir/gone@MavoEAStream"));
}

TEST_F(CleanTest, SeveralDirectoriesAreCleanedThoughOneIsMissing) {
    const TempDir other;
    ObjectFiles{other.path(), "gone"}.MakeStream();
    Files("gone").MakeStream();
    const std::string missing = dir_ / "missing";
    const ToolResult result =
        RunTool({"clean", "--yes", "--wait", "0", dir_.path(), missing, other.path()});
    EXPECT_EQ(1, result.status);
    EXPECT_EQ("mavoea: " + missing + ": No such file or directory; check the path\n", result.err);
    EXPECT_THAT(result.out, HasSubstr("4 removed, 0 kept, 1 failed\n"));
    EXPECT_THAT(Tree(other.path()), IsEmpty());
}

TEST_F(CleanTest, OnlyDirectoriesOfObjectsAreCleaned) {
    MakeObject("file");
    ASSERT_EQ(0, symlink(dir_.path().c_str(), (dir_ / "link").c_str()));
    MakeEaFile("gone@MavoEAStream");
    const struct {
        std::string path;
        std::string cause;
    } cases[] = {
        {dir_ / "file", "Not a directory; check the path"},
        {dir_ / "link", "Not a directory; check the path"},
        {dir_ / "@eaDir", "in an EA directory; name a directory that holds objects"},
    };
    for (const auto& [path, cause] : cases) {
        const ToolResult result = RunTool({"clean", "--yes", "--wait", "0", path});
        EXPECT_THAT(result, Failed(2, path + ": " + cause));
        EXPECT_EQ("0 removed, 0 kept, 1 failed\n", result.out);
    }
    EXPECT_TRUE(Exists(EaFile("gone@MavoEAStream")));
}

TEST_F(CleanTest, WhatCannotBeRemovedIsToldAndTheRestGoes) {
    const auto clean = [this] {
        MakeObject("here");
        MakeEaFile("gone@MavoEAStream");
        WriteFile(dir_ / "._gone", kAppleDouble);
        ASSERT_EQ(0, chmod((dir_ / "@eaDir").c_str(), 0555));
        const ToolResult result = Clean({"--yes"});
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(
            result.err,
            HasSubstr("gone@MavoEAStream: Permission denied; run mavoea as a user who may"));
        EXPECT_THAT(result.out, HasSubstr("1 removed, 0 kept, 1 failed\n"));
        EXPECT_FALSE(Exists(dir_ / "._gone"));
        EXPECT_EQ(0, chmod((dir_ / "@eaDir").c_str(), 0755));
    };
    if (RunsAsRoot()) {  // The superuser may remove everything.
        MAVOEA_SKIP_WITHOUT_OTHER_USERS();
        AsUser(65534, Root::kGivenUp, clean);
    } else {
        clean();
    }
}

}  // namespace
}  // namespace mavoea::test

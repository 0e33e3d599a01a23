// mavoea rm has the habits of rm of coreutils, under both names.

#include <fcntl.h>
#include <sys/wait.h>

#include <cstdlib>

#include "tests/platform/support/private_mounts.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

enum class Name { kMavoeaRm, kRm };
void PrintTo(Name name, std::ostream* out) { *out << (name == Name::kRm ? "rm" : "mavoea rm"); }

std::string InShell(const std::string& word) {
    std::string quoted = "'";
    for (const char c : word) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return quoted + '\'';
}

std::string Contents(const std::string& path) {
    const Bytes bytes = ReadFile(path);
    return {bytes.begin(), bytes.end()};
}

// A working directory on a volume with EA directories, and the tool at work there.
class RmCommandTest : public ::testing::TestWithParam<Name> {
 protected:
    RmCommandTest() {
        for (const std::string& path : {dir_.path(), dir_ / "work"}) {
            mkdir(path.c_str(), 0755);
            chmod(path.c_str(), 0777);
        }
    }

    std::string At(const std::string& path) const { return dir_ / ("work/" + path); }
    void MakeDirectory(const std::string& path) const {
        ASSERT_EQ(0, mkdir(At(path).c_str(), 0755)) << path;
    }
    void MakeFile(const std::string& path, const std::string& data = {}) const {
        WriteFile(At(path), Ascii(data));
    }
    void MakeLink(const std::string& path, const std::string& target) const {
        ASSERT_EQ(0, symlink(target.c_str(), At(path).c_str())) << path;
    }
    // A file with an attribute beside it.
    void MakeObject(const std::string& path) const {
        MakeFile(path);
        ASSERT_EQ(0,
                  RunTool({"--volume", At("") + "=1", "set", At(path), Colour(), "blue"}).status);
    }

    // In an emulator the loader is told the name: started through a link it would look beside that
    // for what the tool needs.
    static std::string StartedAs(const std::string& link) {
        if (!Tested().emulated()) return InShell(link);
        return Tested().emulator + " --argv0 " + InShell(link) + ' ' + InShell(Tested().path);
    }

    // The tool in the working directory, or where these commands lead from there.
    ToolResult Rm(const Arguments& arguments, const std::string& input = {},
                  const std::string& commands = "true") const {
        const TempDir files;
        chmod(files.path().c_str(), 0755);
        const bool as_rm = GetParam() == Name::kRm;
        const std::string program = files / "rm";
        EXPECT_EQ(0, symlink(Tested().path.c_str(), program.c_str()));
        WriteFile(files / "in", Ascii(input));
        std::string line = "cd " + InShell(At("")) + " && " + commands + " && exec ";
        line += as_rm ? StartedAs(program) : Tested().Command() + " rm";
        line += " --volume " + InShell(At("") + "=1");
        for (const std::string& argument : arguments) line += ' ' + InShell(argument);
        line += " <" + InShell(files / "in") + " >" + InShell(files / "out") + " 2>" +
                InShell(files / "err");
        const int status = std::system(line.c_str());  // NOLINT(cert-env33-c)
        ToolResult result;
        result.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
        result.out = Contents(files / "out");
        result.err = Contents(files / "err");
        return result;
    }

    // A message under the tool's name; what comes behind the first ';' is advice.
    static std::string Says(const std::string& message, const std::string& advice) {
        return GetParam() == Name::kRm ? "rm: " + message + '\n'
                                       : "mavoea: " + message + "; " + advice + '\n';
    }
    static std::string Asks(const std::string& question) {
        return (GetParam() == Name::kRm ? "rm: " : "mavoea: ") + question + "? ";
    }

    void ExpectFailure(const Arguments& arguments, const std::string& message,
                       const std::string& advice) const {
        const ToolResult result = Rm(arguments);
        EXPECT_EQ(1, result.status) << ::testing::PrintToString(arguments);
        EXPECT_EQ(Says(message, advice), result.err) << ::testing::PrintToString(arguments);
        EXPECT_EQ("", result.out);
    }
    void ExpectSilence(const Arguments& arguments) const {
        const ToolResult result = Rm(arguments);
        EXPECT_EQ(0, result.status) << ::testing::PrintToString(arguments);
        EXPECT_EQ("", result.out + result.err) << ::testing::PrintToString(arguments);
    }

    static constexpr const char* kPath = "check the path";
    static constexpr const char* kOther = "try again, or check the volume";
    static constexpr const char* kRights = "run mavoea as a user who may, or as root";

 private:
    TempDir dir_;
};
INSTANTIATE_TEST_SUITE_P(UnderBothNames, RmCommandTest,
                         ::testing::Values(Name::kMavoeaRm, Name::kRm), [](const auto& tested) {
                             return tested.param == Name::kRm ? "Rm" : "MavoeaRm";
                         });

// ---- What is refused ----------------------------------------------------------------------------

TEST_P(RmCommandTest, TheDirectoryAndTheOneAboveAreNeverRemoved) {
    MakeDirectory("d");
    MakeFile("d/a");
    const std::string refusal = "refusing to remove '.' or '..' directory: skipping ";
    const std::string advice = "name it from the directory above it";
    const std::pair<std::string, std::string> paths[] = {
        {".", "."},       {"..", ".."},     {"./", "./"},        {"../", "../"},     {"d/.", "d/."},
        {"d/./", "d/./"}, {"d/..", "d/.."}, {"d/.////", "d/./"}, {"d/../", "d/../"},
    };
    for (const auto& [path, shown] : paths) {
        for (const char* flags : {"-r", "-rf", "-ri"}) {
            ExpectFailure({flags, path}, refusal + '\'' + shown + '\'', advice);
        }
    }
    ExpectFailure({"."}, "cannot remove '.': Is a directory", kOther);
    EXPECT_TRUE(Exists(At("d/a")));
}

TEST_P(RmCommandTest, TheRootIsNotRemovedUnderAnyName) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MakeLink("root", "/");
    const std::string danger = "it is dangerous to operate recursively on ";
    const std::string failsafe = "use --no-preserve-root to override this failsafe";
    const std::pair<std::string, std::string> paths[] = {
        {"/", "'/'"}, {"//", "'//' (same as '/')"}, {"root/", "'root/' (same as '/')"}};
    AsUser(1234, Root::kGivenUp, [&] {
        for (const auto& [path, shown] : paths) {
            // Should it not refuse, nothing answers yes.
            const ToolResult result = Rm({"-ri", path});
            EXPECT_EQ(1, result.status);
            EXPECT_EQ(GetParam() == Name::kRm
                          ? "rm: " + danger + shown + "\nrm: " + failsafe + '\n'
                          : "mavoea: " + danger + shown + "; " + failsafe + '\n',
                      result.err);
        }
    });
}

TEST_P(RmCommandTest, DirectoriesTakeAnOption) {
    MakeDirectory("empty");
    MakeDirectory("full");
    MakeFile("full/a");
    for (const char* path : {"empty", "full"}) {
        for (const Arguments& flags : {Arguments{}, {"-f"}, {"-i"}}) {
            Arguments arguments = flags;
            arguments.push_back(path);
            ExpectFailure(arguments, "cannot remove '" + std::string(path) + "': Is a directory",
                          kOther);
        }
    }
    ExpectFailure({"-d", "full"}, "cannot remove 'full': Directory not empty", kOther);
    ExpectFailure({"-df", "full"}, "cannot remove 'full': Directory not empty", kOther);
    ExpectSilence({"-d", "empty"});
    EXPECT_FALSE(Exists(At("empty")));
    EXPECT_TRUE(Exists(At("full/a")));
}

TEST_P(RmCommandTest, ADirectoryWithNothingButMetadataIsEmpty) {
    MakeDirectory("d");
    MakeObject("d/a");
    ASSERT_EQ(0, unlink(At("d/a").c_str()));
    ASSERT_TRUE(Exists(At("d/@eaDir/a@MavoEAStream")));
    ExpectSilence({"-d", "d"});
    EXPECT_FALSE(Exists(At("d")));
}

TEST_P(RmCommandTest, WhatIsNotThereOrNoDirectoryIsNamedAsItWasTyped) {
    MakeFile("f");
    MakeDirectory("d");
    MakeLink("dangling", "none");
    const std::pair<std::string, const char*> paths[] = {
        {"", "No such file or directory"},
        {"none", "No such file or directory"},
        {"d/none", "No such file or directory"},
        {"./d//none", "No such file or directory"},
        {"none/.", "No such file or directory"},
        {"f/", "Not a directory"},
        {"f/x", "Not a directory"},
        {"f/x/y", "Not a directory"},
        {"dangling/", "Not a directory"},
    };
    for (const auto& [path, why] : paths) {
        const std::string message = "cannot remove '" + path + "': " + why;
        ExpectFailure({path}, message, kPath);
        ExpectFailure({"-r", path}, message, kPath);
        ExpectSilence({"-f", path});
        ExpectSilence({"-rf", path});
    }
    const std::string too_long(300, 'n');
    ExpectFailure({"-rf", too_long}, "cannot remove '" + too_long + "': File name too long",
                  "use a shorter name or path");
    EXPECT_TRUE(Exists(At("f")));
    EXPECT_TRUE(Exists(At("dangling")));
    ExpectSilence({"dangling"});
    EXPECT_FALSE(Exists(At("dangling")));
}

TEST_P(RmCommandTest, NothingIsInAWorkingDirectoryThatHasGone) {
    MakeDirectory("gone");
    const ToolResult result = Rm({"x"}, {}, "cd gone && rmdir ../gone");
    EXPECT_EQ(1, result.status);
    EXPECT_EQ(Says("cannot remove 'x': No such file or directory", kPath), result.err);
}

// ---- Where paths lead ---------------------------------------------------------------------------

TEST_P(RmCommandTest, BehindASlashOfALinkTheContentsGoAndNothingElse) {
    MakeDirectory("d");
    MakeObject("d/a");
    MakeLink("link", "d");
    ExpectFailure({"link/"}, "cannot remove 'link/': Is a directory", kOther);
    const ToolResult result = Rm({"-rv", "link/"});
    EXPECT_EQ(1, result.status);
    EXPECT_EQ(Says("cannot remove 'link/': Not a directory", kPath), result.err);
    EXPECT_THAT(result.out, HasSubstr("removed 'link/a'\n"));
    EXPECT_THAT(NamesIn(At("d")), ElementsAre());
    EXPECT_TRUE(Exists(At("link")));
    ExpectSilence({"-rf", "link/"});
    EXPECT_TRUE(Exists(At("d")));
}

TEST_P(RmCommandTest, DotsBehindALinkLeadWhereTheKernelTakesThem) {
    for (const char* path : {"srv", "srv/old", "store", "store/1", "store/old"}) {
        MakeDirectory(path);
    }
    MakeLink("srv/current", "../store/1");
    ExpectSilence({"-r", "srv/current/../old"});
    EXPECT_TRUE(Exists(At("srv/old")));
    EXPECT_FALSE(Exists(At("store/old")));
}

TEST_P(RmCommandTest, VerboseNamesObjectsAsTheyWereTyped) {
    MakeDirectory("d");
    MakeObject("d/a");
    MakeObject("b");
    const ToolResult result = Rm({"-rv", "d///", "./b"});
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(GetParam() == Name::kRm
                  ? "removed 'd/a'\nremoved directory 'd/'\nremoved './b'\n"
                  : "removed 'd/a'\nremoved directory 'd/'\nremoved './b'\n3 removed, 0 failed\n",
              result.out);
    EXPECT_THAT(NamesIn(At("")), ElementsAre());
}

TEST_P(RmCommandTest, CountsAreForTerminals) {
    MakeDirectory("d");
    MakeFile("d/a");
    ExpectSilence({"-r", "d"});
}

// ---- Questions ----------------------------------------------------------------------------------

TEST_P(RmCommandTest, EachQuestionSaysWhatIsToGo) {
    MakeDirectory("d");
    MakeDirectory("d/a");
    MakeFile("d/b");
    MakeFile("d/c", "data");
    MakeLink("d/d", "b");
    ASSERT_EQ(0, mkfifo(At("d/e").c_str(), 0600));
    const ToolResult result = Rm({"-ri", "d"}, "y\ny\ny\ny\ny\ny\ny\n");
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(Asks("descend into directory 'd'") + Asks("remove directory 'd/a'") +
                  Asks("remove regular empty file 'd/b'") + Asks("remove regular file 'd/c'") +
                  Asks("remove symbolic link 'd/d'") + Asks("remove fifo 'd/e'") +
                  Asks("remove directory 'd'"),
              result.err);
    EXPECT_FALSE(Exists(At("d")));
}

TEST_P(RmCommandTest, WhatIsDeclinedIsAskedForAsRmDoes) {
    const auto make = [&] {
        MakeDirectory("d");
        MakeFile("d/a");
        MakeDirectory("d/u");
        MakeFile("d/u/f");
    };
    make();
    // Behind a file that stays the directory is asked for all the same.
    ToolResult result = Rm({"-ri", "d"}, "y\nn\ny\nn\nn\nn\n");
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(Asks("descend into directory 'd'") + Asks("remove regular empty file 'd/a'") +
                  Asks("descend into directory 'd/u'") + Asks("remove regular empty file 'd/u/f'") +
                  Asks("remove directory 'd/u'") + Asks("remove directory 'd'"),
              result.err);
    result = Rm({"-ri", "d"}, "y\nn\ny\ny\ny\ny\n");
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.err, HasSubstr(Asks("remove directory 'd'") +
                                      Says("cannot remove 'd': Directory not empty", kOther)));
    EXPECT_THAT(NamesIn(At("d")), ElementsAre("a"));
    ExpectSilence({"-r", "d"});
    make();
    // Behind a directory that is not entered it is not.
    result = Rm({"-ri", "d"}, "y\ny\nn\ny\n");
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(Asks("descend into directory 'd'") + Asks("remove regular empty file 'd/a'") +
                  Asks("descend into directory 'd/u'"),
              result.err);
    EXPECT_TRUE(Exists(At("d/u/f")));
}

TEST_P(RmCommandTest, OneQuestionForManyOrForATree) {
    for (const char* name : {"1", "2", "3", "4"}) MakeFile(name);
    MakeDirectory("d");
    ToolResult result = Rm({"-I", "1", "2", "3", "4"}, "n\n");
    EXPECT_EQ(0, result.status);
    EXPECT_EQ(Asks("remove 4 arguments"), result.err);
    result = Rm({"--interactive=once", "-R", "d"}, "n\n");
    EXPECT_EQ(Asks("remove 1 argument recursively"), result.err);
    result = Rm({"-Ir", "d", "1"}, "n\n");
    EXPECT_EQ(Asks("remove 2 arguments recursively"), result.err);
    EXPECT_EQ(5U, NamesIn(At("")).size());
    ExpectSilence({"-I", "1", "2", "3"});
    ExpectSilence({"-I", "-f", "-r", "d", "4"});
    EXPECT_THAT(NamesIn(At("")), ElementsAre());
}

TEST_P(RmCommandTest, WhatIsWriteProtectedIsAskedForAtATerminal) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    AsUser(1234, Root::kGivenUp, [&] {
        MakeFile("a");
        MakeFile("b", "data");
        MakeFile("c");
        MakeLink("link", "a");
        MakeDirectory("d");
        MakeDirectory("e");
        MakeFile("e/f");
        for (const char* path : {"a", "b"}) chmod(At(path).c_str(), 0444);
        for (const char* path : {"d", "e"}) chmod(At(path).c_str(), 0555);
        const Arguments all = {"a", "b", "c", "d", "e", "link"};
        Arguments arguments = all;
        arguments.insert(arguments.begin(), {"-r", "---presume-input-tty"});
        const ToolResult result = Rm(arguments, "n\nn\nn\ny\n");
        EXPECT_EQ(1, result.status);
        EXPECT_EQ(Asks("remove write-protected regular empty file 'a'") +
                      Asks("remove write-protected regular file 'b'") +
                      Asks("remove write-protected directory 'd'") +
                      Asks("descend into write-protected directory 'e'") +
                      Says("cannot remove 'e/f': Permission denied", kRights),
                  result.err);
        EXPECT_THAT(NamesIn(At("")), ElementsAre("a", "b", "d", "e"));
        chmod(At("e").c_str(), 0755);
        ExpectSilence({"-r", "a", "b", "d", "e"});
        EXPECT_THAT(NamesIn(At("")), ElementsAre());
    });
}

// ---- Failures -----------------------------------------------------------------------------------

TEST_P(RmCommandTest, WhatCannotBeRemovedIsNamedAndWhatIsAboveItStaysWithoutAWord) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    AsUser(1234, Root::kGivenUp, [&] {
        for (const char* path :
             {"d", "d/closed", "d/closed/sub", "d/dark", "d/dark/sub", "d/inacc"}) {
            MakeDirectory(path);
        }
        MakeFile("d/closed/f");
        MakeFile("d/z");
        chmod(At("d/closed").c_str(), 0555);
        chmod(At("d/dark").c_str(), 0311);
        chmod(At("d/inacc").c_str(), 0);
        const ToolResult result = Rm({"-rf", "d"});
        EXPECT_EQ(1, result.status);
        EXPECT_EQ(Says("cannot remove 'd/closed/f': Permission denied", kRights) +
                      Says("cannot remove 'd/closed/sub': Permission denied", kRights) +
                      Says("cannot remove 'd/dark': Permission denied", kRights),
                  result.err);
        EXPECT_THAT(NamesIn(At("d")), ElementsAre("closed", "dark"));
        chmod(At("d/closed").c_str(), 0755);
        chmod(At("d/dark").c_str(), 0755);
        ExpectSilence({"-r", "d"});
    });
}

TEST_P(RmCommandTest, OtherFileSystemsAreLeftOutWhereThatIsAskedFor) {
    for (const char* path : {"a", "a/b"}) MakeDirectory(path);
    const PrivateMount mounted(At("a/b"), "tmpfs");
    if (!mounted.ok()) GTEST_SKIP() << "needs the right to mount";
    MakeFile("a/b/f");
    MakeFile("a/c");
    const std::string skipping = "skipping 'a/b', since it's on a different device";
    ExpectFailure({"--one-file-system", "-rf", "a"}, skipping, "leave out --one-file-system");
    EXPECT_FALSE(Exists(At("a/c")));
    const std::string second = "and --preserve-root=all is in effect";
    const ToolResult result = Rm({"--preserve-root=all", "-rf", "a/b"});
    EXPECT_EQ(1, result.status);
    EXPECT_EQ(GetParam() == Name::kRm ? "rm: " + skipping + "\nrm: " + second + '\n'
                                      : "mavoea: " + skipping + "; " + second + '\n',
              result.err);
    EXPECT_TRUE(Exists(At("a/b/f")));
}

// ---- Metadata -----------------------------------------------------------------------------------

TEST_P(RmCommandTest, MetadataOfWhatStaysStays) {
    MakeDirectory("d");
    for (const char* name : {"d/a", "d/b"}) MakeObject(name);
    const ToolResult result = Rm({"-ri", "d"}, "y\ny\nn\nn\n");
    EXPECT_EQ(0, result.status);
    EXPECT_THAT(NamesIn(At("d")), ElementsAre("@eaDir", "b"));
    EXPECT_THAT(NamesIn(At("d/@eaDir")), ElementsAre("b@MavoEAStream"));
}

TEST_P(RmCommandTest, WithTheLastObjectTheEaDirectoryGoes) {
    for (const char* name : {"a", "b"}) MakeObject(name);
    MakeFile("@eaDir/.cover");
    ExpectSilence({"a"});
    EXPECT_THAT(NamesIn(At("@eaDir")), ElementsAre(".cover", "b@MavoEAStream"));
    ExpectSilence({"b"});
    EXPECT_THAT(NamesIn(At("")), ElementsAre());
}

// ---- Depth --------------------------------------------------------------------------------------

// Directories of that name in one another, the outermost "deep", an object in each.
void MakeDeep(const std::string& path, int levels, const std::string& name) {
    ASSERT_EQ(0, mkdir(path.c_str(), 0755));
    int at = open(path.c_str(), O_RDONLY | O_DIRECTORY);
    for (int i = 0; i < levels; ++i) {
        ASSERT_EQ(0, mkdirat(at, "@eaDir", 0755));
        for (const char* file : {"z", "@eaDir/z@MavoEAStream"}) {
            close(openat(at, file, O_WRONLY | O_CREAT, 0644));
        }
        ASSERT_EQ(0, mkdirat(at, name.c_str(), 0755));
        const int next = openat(at, name.c_str(), O_RDONLY | O_DIRECTORY);
        ASSERT_LE(0, next);
        close(at);
        at = next;
    }
    close(at);
}

TEST(RmDepthTest, ATreeOfAnyDepthTakesFewDescriptorsAndLittleMemory) {
    constexpr std::size_t kMemory = std::size_t{64} << 20;
    const TempDir dir(FastDirectory());
    const int levels = Tested().emulated() || Tested().sanitized() ? 500 : 5000;
    for (const std::size_t size : {std::size_t{1}, std::size_t{250}}) {
        MakeDeep(dir / "deep", levels, std::string(size, 'd'));
        const ToolResult result = RunTool({"--volume", dir.path() + "=1", "rm", "-r", dir / "deep"},
                                          {}, {.memory = kMemory, .open_files = 64});
        EXPECT_THAT(result, Succeeded());
        EXPECT_FALSE(Exists(dir / "deep"));
    }
}

// Directories are left and opened again on the way down and up: what was listed says no more by
// then to whom a "._" file belonged.
TEST(RmDepthTest, AppleDoubleFilesGoWithTheirObjectsAtAnyDepth) {
    const TempDir dir;
    constexpr int kLevels = 40;
    std::string path = dir / "deep";
    for (int i = 0; i < kLevels; ++i, path += "/d") {
        ASSERT_EQ(0, mkdir(path.c_str(), 0755));
        WriteFile(path + "/z", Ascii("data"));
        WriteFile(path + "/._z", Hex("00051607 00020000 'Mac OS X        ' 0000"));
    }
    const ToolResult result = RunTool({"--volume", dir.path() + "=0", "rm", "-r", dir / "deep"});
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ("", result.err);
    EXPECT_FALSE(Exists(dir / "deep"));
}

TEST(RmDepthTest, ATreeThatIsMovedMeanwhileLeadsToNothingElse) {
    const TempDir dir;
    mkdir((dir / "other").c_str(), 0755);
    WriteFile(dir / "other/z", Ascii("data"));
    MakeDeep(dir / "deep", 30, "d");
    RunningTool tool({"--volume", dir.path() + "=1", "rm", "-ri", dir / "deep"});
    std::string path = dir / "deep";
    for (int i = 0; i < 30; ++i) {
        ASSERT_TRUE(tool.WaitFor("descend into directory '" + path + "'? "));
        tool.Answer("y\n");
        path += "/d";
    }
    ASSERT_TRUE(tool.WaitFor("remove directory '" + path + "'? "));
    ASSERT_EQ(0, rename((dir / "deep/d/d/d").c_str(), (dir / "other/d").c_str()));
    for (int i = 0; i < 100; ++i) tool.Answer("y\n");
    EXPECT_EQ(1, tool.Wait());
    EXPECT_THAT(tool.said(), HasSubstr("it has been moved into another directory meanwhile"));
    EXPECT_TRUE(Exists(dir / "other/z"));
    EXPECT_TRUE(Exists(dir / "deep/d/d/z"));
}

}  // namespace
}  // namespace mavoea::test

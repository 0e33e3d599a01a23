// The command line itself: usage, help, where, volumes.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/support/process.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::StartsWith;

TEST(CommandLineTest, WhatIsWrongWithTheCommandLineIsToldInALine) {
    const Volume volume(0);
    const std::string& object = volume.object();
    const struct {
        Arguments arguments;
        std::string message;
    } cases[] = {
        {{}, "A subcommand is required"},
        {{"list"}, "PATH is required"},
        {{"where"}, "PATH is required"},
        {{"get", object}, "NAME is required"},
        {{"set", object}, "NAME is required"},
        {{"remove", object}, "NAME is required"},
        {{"lock"}, "PATH is required"},
        {{"unlock"}, "PATH is required"},
        {{"import"}, "FILE is required"},
        {{"import", object}, "PATH is required"},
        {{"import", object, object, object}, "The following argument was not expected: " + object},
        {{"export"}, "PATH is required"},
        {{"export", object}, "FILE is required"},
        {{"upgrade", "-r"}, "PATH is required"},
        {{"upgrade", "--record", object}, "The following argument was not expected: --record"},
        {{"repair"}, "PATH is required"},
        {{"clean", "-r"}, "DIR is required"},
        {{"check", "-r"}, "PATH is required"},
        {{"salvage", object}, "DIR is required"},
        {{"convert", object, object}, "--to is required"},
        {{"convert", "--to", "0", object}, "DST is required"},
        {{"convert", "--to", "0", object, object, object},
         "The following argument was not expected: " + object},
        {{"get", "-r", object, "a"}, "The following argument was not expected: -r"},
        {{"dump"}, "FILE is required"},
        {{"dump", "--record"}, "FILE is required"},
        {{"get", object, "a", "b"}, "The following argument was not expected: b"},
        {{"get", "--bogus", object, "a"}, "The following argument was not expected: --bogus"},
        {{"set", object, "a", "value", "--file", "f"}, "VALUE excludes --file"},
        {{"set", object, "a", "--hex"}, "--hex requires VALUE"},
        {{"list", object, "--volume"}, "--volume: 1 required PATH=TYPE missing"},
    };
    for (const auto& [arguments, message] : cases) {
        const ToolResult result = RunTool(arguments);
        EXPECT_THAT(result, Failed(2, message + "; mavoea --help has the usage"));
        EXPECT_EQ("", result.out);
    }
    EXPECT_THAT(RunTool({"bogus"}),
                Failed(2, "bogus: unknown command; mavoea --help has all of them"));
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume.path()));
}

TEST(CommandLineTest, HelpAndVersionAreWrittenToStandardOutput) {
    const ToolResult help = RunTool({"--help"});
    EXPECT_THAT(help, Succeeded());
    for (const char* text :
         {"where",   "list",   "get",       "set",          "remove",       "cp",
          "mv",      "rm",     "lock",      "unlock",       "import",       "export",
          "upgrade", "repair", "clean",     "convert",      "dump",         "--volume PATH=TYPE",
          "check",   "--json", "Examples:", "Exit status:", "Volume types:"}) {
        EXPECT_THAT(help.out, HasSubstr(text));
    }
    for (const char* command :
         {"where",  "list",   "show",    "get",  "set",     "set-info", "remove",  "lock",
          "unlock", "import", "export",  "save", "restore", "carry",    "upgrade", "repair",
          "clean",  "check",  "convert", "diff", "dump",    "salvage",  "plan"}) {
        EXPECT_THAT(RunTool({command, "--help"}), Succeeded());
    }
    const ToolResult version = RunTool({"--version"});
    EXPECT_THAT(version, Succeeded());
    EXPECT_EQ("mavoea 5.0.0\n", version.out);
}

TEST(CommandLineTest, HexadecimalDigitsMustBeInPairs) {
    const Volume volume(0);
    for (const char* value : {"0", "zz", "001", "0 0", "0x0", "0x0x00", "x00", "0:0", "00-00"}) {
        EXPECT_THAT(volume.Run({"set", "--hex", volume.object(), "a", value}),
                    Failed(2, volume.object() +
                                  ": VALUE is not hexadecimal digits; give two digits for each "
                                  "byte, or leave --hex out"));
    }
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume.path()));
}

TEST(CommandLineTest, AFileForTheValueThatCannotBeReadIsTold) {
    const Volume volume(0);
    const std::string file = volume.path() + "/none";
    EXPECT_THAT(volume.Run({"set", volume.object(), "a", "--file", file}),
                Failed(1, file + ": No such file or directory; check the path"));
    EXPECT_EQ(2, volume.Run({"set", volume.object(), "a", "--file", volume.path()}).status);
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume.path()));
}

TEST(CommandLineTest, StandardOutputThatCannotBeWrittenIsAFailure) {
    if (::access("/dev/full", W_OK) != 0) GTEST_SKIP() << "there is no /dev/full";
    const Volume volume(0);
    ASSERT_THAT(volume.Set("a", Ascii("value")), Succeeded());
    const std::string command = Tested().Command() + " --volume " + Quoted(volume.path()) +
                                "=0 get " + Quoted(volume.object()) + " a >/dev/full 2>/dev/null";
    const int status = std::system(command.c_str());
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(2, WEXITSTATUS(status));
}

TEST(CommandLineTest, AFileMayHaveTheNameOfACommand) {
    const Volume volume(0);
    const std::string path = volume.path() + "/x";
    WriteFile(path, {});
    ASSERT_THAT(volume.Run({"set", path, "get", "set"}), Succeeded());
    EXPECT_EQ("set", volume.Run({"get", path, "get"}).out);
    EXPECT_EQ("get\n", volume.Run({"list", path}).out);
}

TEST(CommandLineTest, PathsOfAnyShapeAreLeftWhole) {
    const Volume volume(0);
    const std::string brackets = volume.path() + "/[a,b]";
    WriteFile(brackets, {});
    std::filesystem::current_path(volume.path());
    EXPECT_EQ("[a,b]:\n\n\x01[c]:\n", [&] {
        WriteFile(volume.path() + "/\x01[c]", {});
        const ToolResult result = volume.Run({"list", "[a,b]", "\x01[c]"});
        EXPECT_THAT(result, Succeeded());
        std::string out = result.out;
        const auto at = out.find("\\x01");
        return at == std::string::npos ? out : out.replace(at, 4, "\x01");
    }());
    std::filesystem::current_path("/");
}

TEST(CommandLineTest, RelativePathsAreTakenFromTheCurrentDirectory) {
    const Volume volume(0);
    std::filesystem::create_directory(volume.path() + "/sub");
    std::filesystem::current_path(volume.path() + "/sub");
    ASSERT_THAT(volume.Run({"set", "../sub//./../file.txt", "a", "x"}), Succeeded());
    EXPECT_TRUE(Exists(volume.apple_double()));
    EXPECT_EQ("x", volume.Run({"get", "../file.txt", "a"}).out);
    EXPECT_EQ("x", RunTool({"get", "../file.txt", "a", "--volume", "..=appledouble"}).out);
    std::filesystem::current_path("/");
}

// ---- Volumes ------------------------------------------------------------------------------------

TEST(VolumeOptionTest, MayStandBeforeOrBehindTheCommandAndTheLongestPrefixCounts) {
    const Volume volume(0);
    const std::string& object = volume.object();
    const std::string dir = volume.path();
    const struct {
        Arguments arguments;
        int type;
        std::string given;
    } cases[] = {
        {{"--json", "--volume", dir + "=7", "where", object}, 7, "7"},
        {{"where", object, "--volume", dir + "=xattr", "--json"}, 7, "xattr"},
        {{"where", "--json", "--volume", dir + "=fileea", object}, 2, "fileea"},
        {{"--volume", "/=0", "where", object, "--volume", dir + "=eadir", "--json"}, 1, "eadir"},
        {{"--volume", dir + "=5", "--volume", "/=0", "where", object, "--json"}, 5, "5"},
    };
    for (const auto& [arguments, type, given] : cases) {
        const auto json = RunTool(arguments).json();
        EXPECT_EQ(type, json["type"]);
        EXPECT_EQ("--volume " + dir + "=" + given, json["typeSource"]);
    }
    // The directory is told as it is, from wherever it was named.
    std::filesystem::current_path(dir);
    EXPECT_EQ("--volume " + dir + "=xattr",
              RunTool({"--json", "--volume", ".=xattr", "where", "file.txt"}).json()["typeSource"]);
    std::filesystem::current_path("/");
}

TEST(VolumeOptionTest, ADeclarationThatMeansNothingIsRefused) {
    EXPECT_THAT(RunTool({"--volume", "/x=ext5", "list", "/"}),
                Failed(2,
                       "--volume /x=ext5: unknown volume type \"ext5\"; take a number from 0 to "
                       "12, appledouble, eadir, fileea, xattr, samba, samba-stream, "
                       "samba-all-streams, netatalk, netatalk-samba or linux; Samba's "
                       "streams_depot and \"fruit:resource = xattr\" are not known"));
    EXPECT_THAT(RunTool({"--volume", "/x", "list", "/"}),
                Failed(2,
                       "--volume /x: not of the form PATH=TYPE; for example --volume "
                       "/srv/share=eadir"));
    EXPECT_THAT(RunTool({"--volume", "=1", "list", "/"}),
                Failed(2,
                       "--volume =1: not of the form PATH=TYPE; for example --volume "
                       "/srv/share=eadir"));
}

TEST(VolumeOptionTest, AnUnknownTypeSaysHowToDeclareIt) {
    // No metadata can lie beside the files of a kernel's own file system, and no type is theirs.
    struct stat info;
    if (::stat("/proc/version", &info) != 0) GTEST_SKIP() << "there is no /proc";
    const std::string message =
        "/proc/version: the type of its volume is unknown; declare it with --volume PATH=TYPE or "
        "in /etc/mavoea/volumes";
    EXPECT_THAT(RunTool({"list", "/proc/version"}), Failed(2, message));
    EXPECT_THAT(RunTool({"get", "/proc/version", "a"}), Failed(2, message));
    EXPECT_THAT(RunTool({"set", "/proc/version", "a", "x"}), Failed(2, message));
    EXPECT_THAT(RunTool({"remove", "/proc/version", "a"}), Failed(2, message));
    const ToolResult where = RunTool({"where", "/proc/version"});
    EXPECT_THAT(where, Failed(2, message));
    EXPECT_THAT(where.out, HasSubstr("volume type: -1, unknown"));
    EXPECT_THAT(where.out, HasSubstr("AppleDouble file: /proc/._version (missing)"));
}

TEST(VolumeOptionTest, ATypeThatKeepsNothingSaysSo) {
    for (const int type : {4, 8, 9, 11, 12}) {
        const Volume volume(type);
        EXPECT_THAT(volume.List(),
                    Failed(2, volume.object() + ": volumes of type " + std::to_string(type) +
                                  " keep no metadata; declare it with --volume PATH=TYPE or in "
                                  "/etc/mavoea/volumes"));
    }
}

TEST(VolumeOptionTest, TheRootHasNoPlaceForFilesBesideIt) {
    EXPECT_THAT(RunTool({"list", "/", "--volume", "/=1"}),
                Failed(2,
                       "/: the root has no directory to keep metadata in; name something below "
                       "it"));
}

// ---- where --------------------------------------------------------------------------------------

TEST(WhereTest, ShowsTypeAndPlacesAndWhatIsThere) {
    const Volume volume(0);
    const std::string& dir = volume.path();
    WriteFile(volume.apple_double(), Bytes(82));
    std::filesystem::create_directories(dir + "/@eaDir/file.txt");
    const ToolResult where = volume.Run({"where", volume.object()});
    EXPECT_THAT(where, Succeeded());
    EXPECT_EQ(dir + "/file.txt\n" + "  volume type: 0, AppleDouble (--volume " + dir +
                  "=0)\n"
                  "  EA stream: " +
                  dir + "/@eaDir/file.txt@MavoEAStream (missing)\n" + "  resource file: " + dir +
                  "/@eaDir/file.txt@MavoResource (missing)\n" + "  legacy folder: " + dir +
                  "/@eaDir/file.txt (exists)\n" + "  legacy resource file: " + dir +
                  "/@eaDir/file.txt/MAVO:Resource (missing)\n" + "  AppleDouble file: " + dir +
                  "/._file.txt (exists, 82 bytes)\n",
              where.out);
}

TEST(WhereTest, JsonHasTheSame) {
    const Volume volume(1);
    WriteFile(volume.apple_double(), Bytes(82));
    const auto json = volume.Run({"--json", "where", volume.object() + "/"}).json();
    EXPECT_EQ(volume.object(), json["path"]);
    EXPECT_EQ(1, json["type"]);
    EXPECT_EQ("EA directory", json["typeName"]);
    EXPECT_EQ("--volume " + volume.path() + "=1", json["typeSource"]);
    ASSERT_EQ(5U, json["files"].size());
    EXPECT_EQ("stream", json["files"][0]["kind"]);
    EXPECT_EQ(volume.stream(), json["files"][0]["path"]);
    EXPECT_EQ(false, json["files"][0]["exists"]);
    EXPECT_EQ("resource", json["files"][1]["kind"]);
    EXPECT_EQ(volume.resource(), json["files"][1]["path"]);
    EXPECT_EQ("legacyFolder", json["files"][2]["kind"]);
    EXPECT_EQ("legacyResource", json["files"][3]["kind"]);
    EXPECT_EQ("appleDouble", json["files"][4]["kind"]);
    EXPECT_EQ(volume.apple_double(), json["files"][4]["path"]);
    EXPECT_EQ(true, json["files"][4]["exists"]);
    EXPECT_EQ(82, json["files"][4]["size"]);
}

TEST(WhereTest, ANameTooLongForAnAppleDoubleFileHasNone) {
    const Volume volume(0);
    const std::string name(254, 'n');
    WriteFile(volume.path() + "/" + name, {});
    const ToolResult where = volume.Run({"where", volume.path() + "/" + name});
    EXPECT_THAT(where, Succeeded());
    EXPECT_THAT(where.out, HasSubstr("  AppleDouble file: none, the name is too long for it\n"));
    // The stream's name is cut to 241 bytes and a check character.
    EXPECT_THAT(where.out, HasSubstr("/@eaDir/" + std::string(241, 'n')));
    const auto json = volume.Run({"--json", "where", volume.path() + "/" + name}).json();
    EXPECT_TRUE(json["files"][4]["path"].is_null());
    EXPECT_EQ("the name is too long for it", json["files"][4]["problem"]);
    EXPECT_THAT(volume.Run({"set", volume.path() + "/" + name, "a", "x"}),
                Failed(2, volume.path() + "/" + name +
                              ": the path of its metadata would be too long; use a shorter name "
                              "or path"));
}

TEST(WhereTest, ADanglingSymbolicLinkIsAnObject) {
    const Volume volume(0);
    std::filesystem::create_symlink("nowhere", volume.path() + "/link");
    EXPECT_THAT(volume.Run({"where", volume.path() + "/link"}), Succeeded());
    ASSERT_THAT(volume.Run({"set", volume.path() + "/link", "a", "x"}), Succeeded());
    EXPECT_TRUE(Exists(volume.path() + "/._link"));
}

TEST(WhereTest, APathThatIsNoUtf8IsShownInJsonAllTheSame) {
    const Volume volume(0);
    const std::string path = volume.path() + "/\xFF";
    WriteFile(path, {});
    const auto json = volume.Run({"--json", "where", path}).json();
    EXPECT_EQ(volume.path() + "/\xEF\xBF\xBD", json["path"]);
    EXPECT_THAT(json["pathHex"].get<std::string>(), ::testing::EndsWith("2fff"));
    EXPECT_THAT(json["files"][4]["pathHex"].get<std::string>(), ::testing::EndsWith("2f2e5fff"));
}

}  // namespace
}  // namespace mavoea::test

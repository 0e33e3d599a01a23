// Metadata as text, beside the programs whose text it is: getfattr reads what was restored,
// setfattr restores what was saved, and what getfattr wrote is restored.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/kills.h"
#include "tests/tool/terminal.h"
#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr char kFinderInfoLine[] =
    "user.com.apple.FinderInfo=0x54455854747478740002000000000000000000000000000000000000"
    "00000000\n";

std::vector<std::string> SortedLines(const std::string& text) {
    std::vector<std::string> lines;
    for (std::size_t at = 0; at < text.size();) {
        const std::size_t end = std::min(text.find('\n', at), text.size());
        lines.push_back(text.substr(at, end - at));
        at = end + 1;
    }
    // Whatever is written is to be backed up.
    std::erase(lines, "user.mavoea.archive=\"1\"");
    std::sort(lines.begin(), lines.end());
    return lines;
}

void SetAttribute(const std::string& path, const std::string& name, const Bytes& value) {
    ASSERT_EQ(0, lsetxattr(path.c_str(), name.c_str(), value.data(), value.size(), 0)) << name;
}

// Directories of several kinds side by side.
class SaveTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
    }

    std::string Add(const std::string& kind, const std::string& name) {
        const std::string path = dir_ / name;
        std::filesystem::create_directory(path);
        volumes_.insert(volumes_.end(), {"--volume", path + "=" + kind});
        return path;
    }
    std::string AddWithFile(const std::string& kind, const std::string& name = "volume") {
        const std::string path = Add(kind, name);
        WriteFile(path + "/a", Ascii("data"));
        return path;
    }

    ToolResult Run(Arguments arguments, const std::string& input = {}) const {
        arguments.insert(arguments.begin(), volumes_.begin(), volumes_.end());
        return RunTool(arguments, input);
    }
    ToolResult Restore(const std::string& directory, const std::string& text,
                       Arguments options = {}) const {
        options.insert(options.begin(), {"restore", "--directory", directory});
        return Run(options, text);
    }
    // Of what is in a directory, with paths that begin in it.
    std::string Saved(const std::string& directory, Arguments options = {}) const {
        options.insert(options.begin(), {"save", "-r"});
        options.push_back(directory);
        const ToolResult result = Run(options);
        EXPECT_EQ(0, result.status) << result.err;
        std::string text = result.out;
        const std::string prefix = "# file: " + directory.substr(1) + '/';
        for (std::size_t at; (at = text.find(prefix)) != std::string::npos;) {
            text.replace(at, prefix.size(), "# file: ");
        }
        return text;
    }
    static std::string Getfattr(const std::string& directory, const std::string& options) {
        const ProgramResult result =
            RunProgram("cd " + Quoted(directory) + " && getfattr -P -h -d " + options);
        EXPECT_EQ(0, result.status);
        return result.output;
    }
    std::string Get(const std::string& path, const std::string& name) const {
        const ToolResult result = Run({"get", "--", path, name});
        return result.status == 0 ? result.out : "none";
    }

    TempDir dir_;
    Arguments volumes_;
};

// ---- Between volumes of all kinds ---------------------------------------------------------------

const char* const kKinds[] = {
    "appledouble",  "eadir",    "fileea",         "xattr", "samba",
    "samba-stream", "netatalk", "netatalk-samba", "linux", "samba-all-streams"};

struct Kinds {
    std::string from;
    std::string to;
};
void PrintTo(const Kinds& kinds, std::ostream* out) { *out << kinds.from << " to " << kinds.to; }

std::vector<Kinds> AllPairs() {
    std::vector<Kinds> pairs;
    for (const char* from : kKinds) {
        for (const char* to : kKinds) pairs.push_back({from, to});
    }
    return pairs;
}

class SaveBetweenTest : public SaveTest, public ::testing::WithParamInterface<Kinds> {};
INSTANTIATE_TEST_SUITE_P(Pairs, SaveBetweenTest, ::testing::ValuesIn(Thinned(AllPairs())),
                         [](const auto& tested) {
                             std::string name = tested.param.from + "To" + tested.param.to;
                             std::erase(name, '-');
                             return name;
                         });

TEST_P(SaveBetweenTest, ATreeThatIsRestoredOntoItsDataSaysTheSame) {
    const auto& [from, to] = GetParam();
    const bool attributes_only = from == "xattr" || to == "xattr";
    const std::string source = Add(from, "source");
    const std::string copy = Add(to, "copy");
    for (const std::string& top : {source, copy}) {
        std::filesystem::create_directories(top + "/in=ner\\ d\n");
        WriteFile(top + "/a", Ascii("data"));
        WriteFile(top + "/c", Ascii("data"));
        WriteFile(top + "/in=ner\\ d\n/#b \xFF", Ascii("data"));
    }
    const std::string fork = attributes_only ? ""
                                             : std::string(kFinderInfoLine) +
                                                   "user.com.apple.ResourceFork=\"fork\\012\"\n"
                                                   "user.mavoea.hidden=\"1\"\n"
                                                   "user.mavoea.locked=\"1\"\n";
    // A "._" file has no place for these beside attributes, nor Samba's stream for other dates than
    // that of the backup.
    const std::string entries =
        attributes_only ? ""
                        : std::string("# file: c\n") + kFinderInfoLine +
                              "user.mavoea.comment=\"remark\"\n"
                              "user.mavoea.dates=0x00000002800000000000000380000000\n\n";
    const std::string written =
        "# file: a\n"
        "user.user.colour=\"blue \\\"\\\\\\012\"\n"
        "user.user.odd\\075n\\134ame=0x00ff0041\n"
        "user.user.zeros=0x410000\n" +
        fork + "\n" + entries +
        "# file: in=ner\\134 d\\012\n"
        "user.user.colour=\"red\"\n"
        "\n"
        "# file: in=ner\\134 d\\012/#b \xFF\n"
        "user.user.colour=\"green\"\n"
        "\n";
    ASSERT_THAT(Restore(source, written), Succeeded());
    const std::string saved = Saved(source);
    EXPECT_THAT(Restore(copy, saved), Succeeded());
    EXPECT_EQ(SortedLines(saved), SortedLines(Saved(copy)));
    // The eyes of another command.
    EXPECT_THAT(Run({"diff", "-r", "--data", source, copy}).status, 0);
    EXPECT_EQ(Ascii("blue \"\\\n"), Run({"get", copy + "/a", "user.colour"}).bytes());
    EXPECT_EQ(Hex("00 FF 00 41"), Run({"get", copy + "/a", "user.odd=n\\ame"}).bytes());
    EXPECT_EQ(Hex("41 00 00"), Run({"get", copy + "/a", "user.zeros"}).bytes());
}

TEST_F(SaveTest, WhatTheDestinationHasNoPlaceForIsNamedAndTheRestArrives) {
    const std::string copy = AddWithFile("xattr");
    const ToolResult result =
        Restore(copy, std::string("# file: a\nuser.user.colour=\"blue\"\n") + kFinderInfoLine +
                          "user.mavoea.comment=\"remark\"\n\n");
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, AllOf(HasSubstr(copy + "/a: not all of it was restored: "),
                                  HasSubstr("\"com.apple.FinderInfo\" ("), HasSubstr("comment (")));
    EXPECT_EQ("blue", Get(copy + "/a", "user.colour"));
}

TEST_F(SaveTest, FlagsAndFilesOfOtherServicesComeAlong) {
    const std::string source = AddWithFile("eadir", "source");
    const std::string copy = AddWithFile("eadir", "copy");
    PutKind(source + "/a", "Thumbnail", Hex("00 01 02"));
    ASSERT_THAT(Restore(source,
                        "# file: a\n"
                        "user.colour=\"blue\"\n"
                        "user.mavoea.flags.colour=\"513\"\n"
                        "user.mavoea.entry.3=\"real name\"\n\n"),
                Succeeded());
    const std::string saved = Saved(source);
    EXPECT_THAT(saved, AllOf(HasSubstr("user.mavoea.flags.colour=\"513\"\n"),
                             HasSubstr("user.mavoea.entry.3=\"real name\"\n"),
                             HasSubstr("user.mavoea.service.@Thumbnail=0sAAEC\n")));
    EXPECT_THAT(Restore(copy, saved), Succeeded());
    EXPECT_EQ(SortedLines(saved), SortedLines(Saved(copy)));
    EXPECT_EQ(Hex("00 01 02"), ReadFile(copy + "/@eaDir/a@Thumbnail"));
    EXPECT_EQ(ReadFile(source + "/@eaDir/a@MavoEAStream"),
              ReadFile(copy + "/@eaDir/a@MavoEAStream"));
    EXPECT_EQ(ReadFile(source + "/@eaDir/a@MavoResource"),
              ReadFile(copy + "/@eaDir/a@MavoResource"));
}

TEST_F(SaveTest, NamesThatMeanSomethingElseInATextComeBack) {
    const std::string source = AddWithFile("eadir", "source");
    const std::string copy = AddWithFile("eadir", "copy");
    const std::vector<std::string> names = {
        "mavoea.comment",    "mavoea.attribute.x",     "mavoea.writable",    "mavo.attributes",
        "DOSATTRIB",         "org.netatalk.Metadata",  "netatalk.Metadata",  "mavo.filea.flushtime",
        "DosStream.x:$DATA", "DosStreamExt.1.x:$DATA", std::string(254, 'n')};
    for (const std::string& name : names) {
        ASSERT_THAT(Run({"set", source + "/a", name, "value of " + name.substr(0, 20)}),
                    Succeeded());
    }
    EXPECT_THAT(Restore(copy, Saved(source)), Succeeded());
    for (const std::string& name : names) {
        EXPECT_EQ("value of " + name.substr(0, 20), Get(copy + "/a", name)) << name;
    }
}

TEST_F(SaveTest, AttributesKeepTheirOrder) {
    const std::string source = AddWithFile("eadir", "source");
    const std::string copy = AddWithFile("eadir", "copy");
    for (const char* name : {"d", "a", "c", "b"}) {
        ASSERT_THAT(Run({"set", source + "/a", name, name}), Succeeded());
    }
    EXPECT_THAT(Restore(copy, Saved(source)), Succeeded());
    EXPECT_EQ("d\na\nc\nb\n", Run({"list", copy + "/a"}).out);
    EXPECT_EQ(ReadFile(source + "/@eaDir/a@MavoEAStream"),
              ReadFile(copy + "/@eaDir/a@MavoEAStream"));
}

TEST_F(SaveTest, ValuesReplaceThoseOfTheSameNameAndTheRestStays) {
    for (const char* kind : {"eadir", "appledouble", "linux", "samba"}) {
        const std::string volume = AddWithFile(kind, kind);
        ASSERT_THAT(Run({"set", volume + "/a", "colour", "red"}), Succeeded());
        ASSERT_THAT(Run({"set", volume + "/a", "shape", "round"}), Succeeded());
        ASSERT_THAT(Run({"set", volume + "/a", "com.apple.ResourceFork", "fork"}), Succeeded());
        EXPECT_THAT(Restore(volume, "# file: a\nuser.colour=\"green\"\nuser.colour=\"blue\"\n\n"),
                    Succeeded());
        EXPECT_EQ("blue", Get(volume + "/a", "colour"));
        EXPECT_EQ("round", Get(volume + "/a", "shape"));
        EXPECT_EQ("fork", Get(volume + "/a", "com.apple.ResourceFork"));
    }
}

// ---- Beside getfattr and setfattr ---------------------------------------------------------------

TEST_F(SaveTest, GetfattrReadsWhatWasRestored) {
    const std::string volume = AddWithFile("linux");
    const std::string text =
        "# file: a\n"
        "user.a\\075b\\134c\\012d\xFF=\"a value x\\\"y\\\\z\\012\"\n"
        "user.binary=0sAAH/\n"
        "user.com.apple.FinderInfo=0sVEVYVHR0eHQAAgAAAAAAAAAAAAAAAAAAAAAAAAAAAAA=\n"
        "user.com.apple.ResourceFork=\"fork\"\n"
        "user.empty=\"\"\n"
        "\n";
    EXPECT_THAT(Restore(volume, text), Succeeded());
    EXPECT_EQ(text, Getfattr(volume, "a"));
    EXPECT_EQ(SortedLines(text), SortedLines(Saved(volume)));
}

TEST_F(SaveTest, SetfattrRestoresWhatWasSaved) {
    const std::string volume = AddWithFile("eadir");
    const std::string plain = Add("linux", "plain");
    WriteFile(plain + "/a", Ascii("data"));
    for (int byte = 1; byte < 256; ++byte) {
        const std::string name = std::string("n") + static_cast<char>(byte);
        ASSERT_THAT(
            Run({"set", volume + "/a", name, "v" + std::string(1, static_cast<char>(byte))}),
            Succeeded());
        if (byte % 16 != 0 && byte != '=' && byte != '\\' && byte != '\n') byte += 3;
    }
    ASSERT_THAT(Run({"set", volume + "/a", "zeros", "--hex", "410000"}), Succeeded());
    ASSERT_THAT(Run({"set", volume + "/a", "empty", ""}), Succeeded());
    ASSERT_THAT(Run({"set", volume + "/a", "com.apple.ResourceFork", "fork"}), Succeeded());
    for (const char* encoding : {"", "text", "hex", "base64"}) {
        const Arguments options =
            *encoding == '\0' ? Arguments{} : Arguments{"--encoding", encoding};
        WriteFile(dir_ / "text", Ascii(Saved(volume, options)));
        ASSERT_EQ(0, unlink((plain + "/a").c_str()));
        WriteFile(plain + "/a", Ascii("data"));
        ASSERT_EQ(0, RunProgram("cd " + Quoted(plain) + " && setfattr --restore=../text").status);
        EXPECT_THAT(
            Run({"--volume", plain + "=linux", "diff", "-r", "--data", volume, plain}).status, 0)
            << encoding;
        EXPECT_EQ(Hex("41 00 00"), FileAttribute(plain + "/a", "user.zeros")) << encoding;
    }
}

class DumpOfTest : public SaveTest, public ::testing::WithParamInterface<std::string> {};
INSTANTIATE_TEST_SUITE_P(Kinds, DumpOfTest,
                         ::testing::Values("samba", "samba-stream", "samba-all-streams", "netatalk",
                                           "netatalk-samba", "linux"),
                         [](const auto& tested) {
                             std::string name = tested.param;
                             std::erase(name, '-');
                             return name;
                         });

TEST_P(DumpOfTest, WhatGetfattrWroteIsRestoredInEveryEncoding) {
    const std::string source = AddWithFile(GetParam(), "source");
    ASSERT_THAT(Restore(source, std::string("# file: a\nuser.colour=\"blue\"\n"
                                            "user.bytes=0x00ff0041\nuser.long=\"") +
                                    std::string(2000, 'x') + "\"\n" + kFinderInfoLine +
                                    "user.mavoea.comment=\"remark\"\n"
                                    "user.mavoea.hidden=\"1\"\nuser.mavoea.locked=\"1\"\n\n"),
                Succeeded());
    int number = 0;
    for (const char* options :
         {"a", "-e text a", "-e hex a", "-e base64 a", "-m - a", "-R .", "-R -m - -e text ."}) {
        SCOPED_TRACE(options);
        const std::string copy = AddWithFile("eadir", "copy" + std::to_string(number++));
        const ToolResult result = Restore(copy, Getfattr(source, options), {"--from", GetParam()});
        EXPECT_EQ(0, result.status) << result.err;
        EXPECT_EQ(0, Run({"diff", "-r", "--data", source, copy}).status);
        EXPECT_EQ("blue", Get(copy + "/a", "colour"));
        EXPECT_EQ(Hex("00 FF 00 41"), Run({"get", copy + "/a", "bytes"}).bytes());
        EXPECT_EQ("1", Get(copy + "/a", "mavoea.locked"));
        // What the names tell needs no type.
        if (GetParam() == "netatalk-samba") continue;
        const std::string untold = AddWithFile("eadir", "copy" + std::to_string(number++));
        EXPECT_EQ(0, Restore(untold, Getfattr(source, options)).status);
        EXPECT_EQ(SortedLines(Saved(copy)), SortedLines(Saved(untold)));
    }
}

TEST_F(SaveTest, NulsThatGetfattrLeavesOutOfTextsComeBackWhereTheyMustBe) {
    const std::string source = AddWithFile("samba", "source");
    SetAttribute(source + "/a", "user.DosStream.one:$DATA", Hex("'a' 00"));
    SetAttribute(source + "/a", "user.DosStream.two:$DATA", Hex("'a' 00 00"));
    SetAttribute(source + "/a", "user.DosStream.goes on:$DATA", Hex("'abc' 01"));
    SetAttribute(source + "/a", "user.DosStreamExt.1.goes on:$DATA", Hex("'def'"));
    for (const char* encoding : {"text", "hex", "base64"}) {
        const std::string copy = AddWithFile("eadir", encoding);
        EXPECT_THAT(Restore(copy, Getfattr(source, std::string("-e ") + encoding + " a")),
                    Succeeded());
        EXPECT_EQ(Hex("'a'"), Run({"get", copy + "/a", "one"}).bytes()) << encoding;
        EXPECT_EQ(Hex("'a' 00"), Run({"get", copy + "/a", "two"}).bytes()) << encoding;
        EXPECT_EQ(Hex("'abcdef'"), Run({"get", copy + "/a", "goes on"}).bytes()) << encoding;
    }
}

TEST_F(SaveTest, PathsAndNamesOfAnyBytesAreTakenFromGetfattrAndGivenToIt) {
    const std::string source = Add("linux", "source");
    const std::string copy = Add("eadir", "copy");
    std::vector<std::string> names = DifficultNames();
    names.insert(names.end(),
                 {"a=b", "#file", "# file: x", "\"quoted\"", "tab\t", "cr\r", "\\012"});
    for (const std::string& name : names) {
        for (const std::string& top : {source, copy}) WriteFile(top + '/' + name, Ascii("data"));
        SetAttribute(source + '/' + name, "user." + name.substr(0, 200), Ascii("of " + name));
    }
    const std::string theirs = Getfattr(source, "-R .");
    EXPECT_EQ(SortedLines(theirs), SortedLines(Saved(source)));
    EXPECT_THAT(Restore(copy, theirs), Succeeded());
    for (const std::string& name : names) {
        EXPECT_EQ("of " + name, Get(copy + '/' + name, name.substr(0, 200))) << name;
    }
}

TEST_F(SaveTest, LargeValuesComeThroughInEveryEncoding) {
    const std::string source = AddWithFile("eadir", "source");
    const std::string value = std::string(65536, 'x') + '\xFF';
    WriteFile(dir_ / "value", Pattern(3'000'001));
    ASSERT_THAT(Run({"set", source + "/a", "large", "--file", dir_ / "value"}), Succeeded());
    ASSERT_THAT(Run({"set", source + "/a", "com.apple.ResourceFork"}, value), Succeeded());
    for (const char* encoding : {"text", "hex", "base64"}) {
        const std::string copy = AddWithFile("appledouble", encoding);
        EXPECT_THAT(Restore(copy, Saved(source, {"--encoding", encoding})), Succeeded());
        EXPECT_TRUE(ReadFile(dir_ / "value") == Run({"get", copy + "/a", "large"}).bytes());
        EXPECT_TRUE(value == Run({"get", copy + "/a", "com.apple.ResourceFork"}).out);
    }
}

// ---- Texts that somebody has forged or damaged --------------------------------------------------

TEST_F(SaveTest, ADamagedLineIsToldWithItsPlaceAndTheOtherObjectsAreRestored) {
    const std::string volume = AddWithFile("eadir");
    WriteFile(volume + "/b", Ascii("data"));
    const struct {
        std::string line;
        const char* problem;
    } cases[] = {
        {"user.x=0x1", "its value has an odd number of hexadecimal digits"},
        {"user.x=0xgg", "its value has a character that is no hexadecimal digit"},
        {"user.x=0sYQ", "its value is no base64"},
        {"user.x=\"a", "its value has no closing quote"},
        {"user.x=\"\\q\"", "a backslash in its value begins no escape"},
        {"user.x=\"\\777\"", "a backslash in its value begins no escape"},
        {"user.x\\=\"a\"",
         "the attribute's name: a backslash in it is not followed by three octal"},
        {"user.x\\000=\"a\"", "the attribute's name: a NUL byte stands in it"},
        {std::string("user.x=\"a\0\"", 11), "a NUL byte stands in it"},
        {std::string("user\0x=\"a\"", 10), "the attribute's name: a NUL byte stands in it"},
        {"=\"a\"", "the attribute's name: it is empty"},
        {"user.x=0x" + std::string(136'000'000, '0'), "the line is longer than that of any value"},
    };
    for (const auto& [line, problem] : cases) {
        const std::string text = "# a comment\r\n# file: a\n# another\nuser.y=\"1\"\n" + line +
                                 "\nuser.z=\"1\"\n\n# file: b\r\nuser.colour=\"blue\"\r\n\r\n";
        const ToolResult result = Restore(volume, text);
        EXPECT_EQ(2, result.status) << problem;
        EXPECT_THAT(result.err, StartsWith(std::string("mavoea: standard input:5: ") + problem));
        EXPECT_EQ(1, std::count(result.err.begin(), result.err.end(), '\n')) << result.err;
        EXPECT_EQ("", Run({"list", volume + "/a"}).out) << problem;
        EXPECT_EQ("blue", Get(volume + "/b", "colour")) << problem;
        ASSERT_THAT(Run({"remove", volume + "/b", "colour"}), Succeeded());
    }
    WriteFile(dir_ / "text",
              Ascii("user.x=\"1\"\nuser.y=\"1\"\n# file: b\nuser.colour=\"red\"\n\n"));
    EXPECT_THAT(Run({"restore", "--directory", volume, dir_ / "text"}),
                Failed(2, dir_ / "text" +
                              ":1: no object is named before this line, by \"# file: \"; mend the "
                              "line; its object stays as it is"));
    EXPECT_EQ("red", Get(volume + "/b", "colour"));
}

TEST_F(SaveTest, PathsLeadToWhatIsBelowTheDirectoryOnlyAndThroughNoLink) {
    const std::string volume = AddWithFile("linux");
    const std::string outside = Add("linux", "outside");
    WriteFile(outside + "/a", Ascii("data"));
    ASSERT_EQ(0, symlink("../outside", (volume + "/link").c_str()));
    ASSERT_EQ(0, symlink("../outside/a", (volume + "/end").c_str()));
    ASSERT_EQ(0, symlink("a", (volume + "/near").c_str()));
    for (const std::string& path :
         {std::string("../outside/a"), std::string("x/../../outside/a"), outside + "/a",
          std::string("link/a"), std::string("end"), std::string("near"), std::string("a/b"),
          std::string("none"), std::string(".."), std::string("\\056\\056/outside/a"),
          std::string("\\057") + outside.substr(1) + "/a"}) {
        const ToolResult result =
            Restore(volume, "# file: " + path + "\nuser.x=\"1\"\n\n# file: a\nuser.y=\"1\"\n\n");
        EXPECT_EQ(2, result.status) << path;
        EXPECT_EQ("1", Get(volume + "/a", "y")) << path;
        EXPECT_EQ("none", Get(volume + "/a", "x")) << path;
        EXPECT_TRUE(FileAttribute(outside + "/a", "user.x").empty()) << path;
        ASSERT_THAT(Run({"remove", volume + "/a", "y"}), Succeeded());
    }
    for (const char* path : {"./a", "a/", ".//a", "./././a"}) {
        EXPECT_THAT(Restore(volume, std::string("# file: ") + path + "\nuser.x=\"1\"\n\n"),
                    Succeeded());
        EXPECT_THAT(Run({"remove", volume + "/a", "x"}), Succeeded()) << path;
    }
    EXPECT_THAT(Restore(volume, "# file: .\nuser.x=\"1\"\n\n"), Succeeded());
    EXPECT_EQ(Ascii("1"), FileAttribute(volume, "user.x"));
}

TEST_F(SaveTest, MetadataIsNoObjectOfAText) {
    const std::string volume = AddWithFile("eadir");
    const std::string doubles = AddWithFile("appledouble", "doubles");
    for (const std::string& top : {volume, doubles}) {
        ASSERT_THAT(Run({"set", top + "/a", "colour", "blue"}), Succeeded());
    }
    for (const char* path : {"@eaDir", "@eaDir/a@MavoEAStream"}) {
        EXPECT_THAT(Restore(volume, std::string("# file: ") + path + "\nuser.x=\"1\"\n\n").err,
                    HasSubstr("what it leads to is metadata itself"));
    }
    EXPECT_THAT(Restore(doubles, "# file: ._a\nuser.x=\"1\"\n\n").err,
                HasSubstr("what it leads to is metadata itself"));
    EXPECT_EQ((std::vector<std::string>{"._a", "a"}), NamesIn(doubles));
    EXPECT_EQ((std::vector<std::string>{"a@MavoEAStream"}), NamesIn(volume + "/@eaDir"));
}

TEST_F(SaveTest, ForgedNamesOfServicesFilesLeadNowhere) {
    const std::string volume = AddWithFile("eadir");
    WriteFile(volume + "/a@b", Ascii("data"));
    for (const char* name :
         {"/../../b", "/x/../../b", "/", "//b", "/.", "@MavoEAStream", "@MavoResource",
          "@MavoResourceTmp", "@a/b", "@", "b", "", "../b", "@b@Thumbnail", "/.mavoea-abcdefgh"}) {
        const ToolResult result =
            Restore(volume, "# file: a\nuser.mavoea.service." + std::string(name) + "=\"x\"\n\n");
        EXPECT_EQ(2, result.status) << name;
        EXPECT_EQ((std::vector<std::string>{"a", "a@b"}), NamesIn(volume)) << name;
    }
}

TEST_F(SaveTest, ReservedNamesTakeWhatTheyMeanAndNothingElse) {
    const std::string volume = AddWithFile("eadir");
    for (const char* line :
         {"user.mavoea.locked=\"0\"", "user.mavoea.hidden=\"yes\"", "user.mavoea.created=\"-1\"",
          "user.mavoea.created=\"18446744073709551616\"", "user.mavoea.flags.none=\"1\"",
          "user.mavoea.entry.2=\"x\"", "user.mavoea.entry.9=\"x\"", "user.mavoea.entry.x=\"x\"",
          "user.mavoea.entry.4294967296=\"x\"", "user.mavoea.dates=0x00",
          "user.mavoea.afpinfo=0x00", "user.mavoea.later=\"1\"", "user.mavoea.attribute.=\"1\"",
          "user.mavoea.attribute.mavoea.locked=\"1\"", "user.com.apple.FinderInfo=\"short\"",
          "user.org.netatalk.Metadata=\"short\"", "user.DOSATTRIB=\"no\""}) {
        const ToolResult result =
            Restore(volume, std::string("# file: a\nuser.colour=\"blue\"\n") + line + "\n\n");
        EXPECT_EQ(2, result.status) << line;
        EXPECT_EQ("colour\n", Run({"list", volume + "/a"}).out) << line;
    }
}

TEST_F(SaveTest, WhatIsNobodysMetadataIsLeftOutAndSaid) {
    const std::string volume = AddWithFile("eadir");
    const ToolResult result =
        Restore(volume,
                "# file: a\nsecurity.selinux=\"x\"\nsystem.posix_acl_access=0x02\n"
                "trusted.x=\"1\"\nuser.colour=\"blue\"\n\n");
    EXPECT_EQ(0, result.status);
    for (const char* name : {"security.selinux", "system.posix_acl_access", "trusted.x"}) {
        EXPECT_THAT(result.err, HasSubstr(std::string("note: \"") + name +
                                          "\" of 1 object is no metadata of Macs or SMB clients"));
    }
    EXPECT_EQ("colour\n", Run({"list", volume + "/a"}).out);
}

// What is there after a text that was cut is right, or not there; and a value that is short is
// never taken for a whole one.
TEST_F(SaveTest, ATextThatWasCutLeavesNoWrongValue) {
    const std::string text = "# file: a\nuser.hex=0x0102\nuser.text=\"blue\\\"\\\"\"\n\n";
    const std::string volume = AddWithFile("appledouble");
    for (std::size_t size = 0; size < text.size(); size += SeriesStep()) {
        const std::string cut = text.substr(0, size);
        const ToolResult result = Restore(volume, cut);
        const bool told =
            result.status == 2 || result.err.find("may be missing") != result.err.npos;
        EXPECT_TRUE(told || size == 0) << cut;
        const std::vector<std::string> lines = {"", "# file: a", "user.hex=0x0102",
                                                "user.text=0x626c75652222"};
        for (const std::string& line : SortedLines(Saved(volume, {"--encoding", "hex"}))) {
            EXPECT_THAT(lines, Contains(line)) << cut;
        }
        std::filesystem::remove(volume + "/._a");
    }
    EXPECT_THAT(Restore(volume, text), Succeeded());
}

// ---- Runs that are killed -----------------------------------------------------------------------

class SaveKillTest : public SaveTest, public ::testing::WithParamInterface<std::string> {};
INSTANTIATE_TEST_SUITE_P(Kinds, SaveKillTest,
                         ::testing::Values("eadir", "appledouble", "fileea", "linux"));

TEST_P(SaveKillTest, TheSameCommandBringsAKilledRunToItsEnd) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    const bool doubles = GetParam() == "appledouble";
    const std::string volume = Add(GetParam(), "volume");
    WriteFile(dir_ / "text",
              Ascii("# file: a\n"
                    "user.user.colour=\"blue\"\nuser.com.apple.ResourceFork=\"new fork\"\n"
                    "user.mavoea.hidden=\"1\"\n" +
                    std::string(doubles ? "" : "user.mavoea.comment=\"remark\"\n") +
                    "\n# file: b\nuser.user.colour=\"green\"\n\n"));
    Arguments arguments = volumes_;
    arguments.insert(arguments.end(), {"restore", "--directory", volume, dir_ / "text"});
    const auto make = [&] {
        for (const std::string& name : NamesIn(volume)) {
            std::filesystem::remove_all(volume + '/' + name);
        }
        for (const char* name : {"/a", "/b"}) {
            WriteFile(volume + name, Ascii("data"));
            ASSERT_THAT(Run({"set", volume + name, "user.colour", "red"}), Succeeded());
            ASSERT_THAT(Run({"set", volume + name, "user.shape", "round"}), Succeeded());
        }
    };
    make();
    ASSERT_THAT(RunTool(arguments), Succeeded());
    const auto wanted = Everything(volume);
    const std::string saved = Saved(volume);
    EXPECT_THAT(saved, AllOf(HasSubstr("blue"), HasSubstr("green"), HasSubstr("round")));
    KillAtEachChange(arguments, volume, make, [&] {
        EXPECT_EQ("round", Get(volume + "/a", "user.shape"));
        EXPECT_THAT(RunTool(arguments), Succeeded());
        EXPECT_EQ(SortedLines(saved), SortedLines(Saved(volume)));
        EXPECT_EQ(std::vector<std::string>(), Differences(wanted, Everything(volume)));
    });
}

// ---- Options ------------------------------------------------------------------------------------

TEST_F(SaveTest, PathsStandAsGetfattrHasThem) {
    const std::string volume = AddWithFile("linux");
    ASSERT_THAT(Run({"set", volume + "/a", "x", "1"}), Succeeded());
    ASSERT_THAT(Run({"set", volume, "x", "1"}), Succeeded());
    for (const std::string& path : {volume + "/a", volume, "/" + volume}) {
        ToolResult ours = Run({"save", path});
        EXPECT_EQ(RunProgram("getfattr -d " + path + " 2>/dev/null").output, ours.out) << path;
        EXPECT_THAT(ours.err, HasSubstr("note: paths stand without the '/' at their beginning"));
        ours = Run({"save", "--absolute-names", path});
        EXPECT_THAT(ours, Succeeded());
        EXPECT_EQ(RunProgram("getfattr --absolute-names -d " + path).output, ours.out) << path;
    }
    EXPECT_EQ(2, Run({"save", volume + "/../volume/a"}).status);
    const std::string text = Run({"save", "--absolute-names", volume + "/a"}).out;
    ASSERT_THAT(Run({"remove", volume + "/a", "x"}), Succeeded());
    EXPECT_EQ(2, Run({"restore"}, text).status);
    EXPECT_THAT(Run({"restore", "--absolute-names"}, text), Succeeded());
    EXPECT_EQ("1", Get(volume + "/a", "x"));
}

TEST_F(SaveTest, AFileIsNewAndItsOwnersOnly) {
    const std::string volume = AddWithFile("eadir");
    ASSERT_THAT(Run({"set", volume + "/a", "x", "1"}), Succeeded());
    const std::string file = dir_ / "text";
    const auto json = Run({"--json", "save", "--output", file, volume + "/a"}).json();
    EXPECT_EQ(1, json["done"]);
    EXPECT_EQ("# file: " + volume.substr(1) + "/a\nuser.x=\"1\"\n\n", TextOf(file));
    EXPECT_EQ(0600, ModeOf(file));
    EXPECT_EQ(2, Run({"save", "--output", file, volume + "/a"}).status);
    EXPECT_EQ(0, Run({"save", "--force", "--output", file, volume + "/a"}).status);
    EXPECT_EQ(2, Run({"--json", "save", volume + "/a"}).status);
    EXPECT_EQ(2, Run({"save", "--encoding", "octal", volume + "/a"}).status);
    EXPECT_EQ(2, Run({"save", volume + "/none"}).status);
}

TEST_F(SaveTest, ATerminalIsGivenNoCommandsAndTheTextMeansTheSame) {
    const std::string volume = AddWithFile("eadir");
    const std::string value = "a long value with one command in it \x1B[2J";
    ASSERT_THAT(Run({"set", volume + "/a", "na\x1Bme", value}), Succeeded());
    Arguments arguments = volumes_;
    arguments.insert(arguments.end(), {"save", "-r", "--absolute-names", volume});
    const Shown on_terminal = RunOnTerminal(arguments);
    if (on_terminal.status < 0) GTEST_SKIP() << "there are no terminals here";
    const std::string& shown = on_terminal.text;
    EXPECT_EQ(0, on_terminal.status);
    EXPECT_EQ("# file: " + volume + "/a\r\nuser.na\\033me=\"a long value with one command in it " +
                  "\\033[2J\"\r\n\r\n",
              shown);
    ASSERT_THAT(Run({"remove", volume + "/a", "na\x1Bme"}), Succeeded());
    EXPECT_THAT(Run({"restore", "--absolute-names"}, shown), Succeeded());
    EXPECT_EQ(value, Get(volume + "/a", "na\x1Bme"));
}

TEST_F(SaveTest, WhatCannotBeReadIsNamedAndTheRestIsSaved) {
    const std::string volume = AddWithFile("eadir");
    WriteFile(volume + "/b", Ascii("data"));
    for (const char* name : {"/a", "/b"}) {
        ASSERT_THAT(Run({"set", volume + name, "x", "1"}), Succeeded());
    }
    Bytes stream = ReadFile(volume + "/@eaDir/a@MavoEAStream");
    stream.resize(stream.size() - 1);
    WriteFile(volume + "/@eaDir/a@MavoEAStream", stream);
    const ToolResult result = Run({"save", "-r", volume});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("@eaDir/a@MavoEAStream"));
    EXPECT_EQ("# file: " + volume.substr(1) + "/b\nuser.x=\"1\"\n\n", result.out);
}

}  // namespace
}  // namespace mavoea::test

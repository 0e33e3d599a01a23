// Many paths at a time: those that a file lists, results for programs, parts of the work, and how
// far it is.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <memory>
#include <set>

#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

constexpr int kAppleDouble = 0;

// The parts of `text` that `end` ends; what is behind the last one would be lost.
std::vector<std::string> Split(const std::string& text, char end) {
    EXPECT_TRUE(text.empty() || text.back() == end);
    std::vector<std::string> parts;
    for (std::size_t at = 0; at < text.size();) {
        const std::size_t stop = std::min(text.find(end, at), text.size());
        parts.push_back(text.substr(at, stop - at));
        at = stop + 1;
    }
    return parts;
}

std::vector<std::string> Sorted(std::vector<std::string> texts) {
    std::sort(texts.begin(), texts.end());
    return texts;
}

class ManyPathsTest : public ::testing::Test {
 protected:
    std::string At(const std::string& name) const { return share_.path() + '/' + name; }
    std::string Make(const std::string& name) const {
        std::filesystem::create_directories(std::filesystem::path(At(name)).parent_path());
        WriteFile(At(name), Ascii("data"));
        return At(name);
    }
    std::string MakeWithAttribute(const std::string& name) const {
        const std::string path = Make(name);
        EXPECT_THAT(share_.Run({"set", path, "user.k", "v"}), Succeeded());
        return path;
    }
    Arguments With(Arguments arguments) const {
        arguments.insert(arguments.begin(),
                         {"--volume", share_.path() + '=' + std::to_string(share_.type())});
        return arguments;
    }

    const Volume share_{kAppleDouble};
};

// ---- Paths from a file --------------------------------------------------------------------------

TEST_F(ManyPathsTest, AListNamesTheObjectsWithWhateverBytesTheirNamesHave) {
    const std::string one = MakeWithAttribute("one\nname");
    const std::string two = MakeWithAttribute("\xFF two ");
    const std::string names = one + '\0' + two + '\0';
    const std::string records = one + '\0' + "user.k" + '\0' + two + '\0' + "user.k" + '\0';
    const TempDir dir;
    WriteFile(dir / "names", Ascii(names));
    EXPECT_EQ(records, share_.Run({"list", "-0", "--files0-from", dir / "names"}).out);
    EXPECT_EQ(records, share_.Run({"list", "-0", "--files0-from=-"}, names).out);
    // The last NUL may be missing.
    const ToolResult cut =
        share_.Run({"list", "-0", "--files0-from", "-"}, names.substr(0, names.size() - 1));
    EXPECT_EQ(records, cut.out);
    EXPECT_THAT(cut, Succeeded());
    const ToolResult nothing = share_.Run({"list", "-0", "--files0-from", "-"});
    EXPECT_EQ("", nothing.out);
    EXPECT_THAT(nothing, Succeeded());
}

TEST_F(ManyPathsTest, CommandsThatTakeSeveralPathsTakeThemFromAList) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(share_.path());
    const std::string list = "--files0-from=-";
    const std::string a = MakeWithAttribute("a/file");
    const std::string b = MakeWithAttribute("b/file");
    const std::string both = At("a") + '\0' + At("b") + '\0';
    EXPECT_THAT(share_.Run({"lock", "-r", list}, both), Succeeded());
    for (const std::string& path : {a, b}) {
        EXPECT_EQ("1", share_.Run({"get", path, "mavoea.locked"}).out);
    }
    EXPECT_THAT(share_.Run({"unlock", list}, a + '\0' + b), Succeeded());
    for (const std::string& path : {a, b}) {
        EXPECT_EQ("0", share_.Run({"get", path, "mavoea.locked"}).out);
    }
    WriteFile(At("a/._gone"), ReadFile(At("a/._file")));
    WriteFile(At("b/._gone"), ReadFile(At("b/._file")));
    EXPECT_THAT(share_.Run({"clean", "--yes", "--wait", "0", list}, both).out,
                HasSubstr("2 removed, 0 kept, 0 failed\n"));

    const Volume other(1);
    for (const char* name : {"x", "y"}) {
        std::filesystem::create_directory(other.path() + '/' + name);
        WriteFile(other.path() + '/' + name + "/z", Ascii("data"));
    }
    const std::string trees = other.path() + "/x" + '\0' + other.path() + "/y";
    EXPECT_EQ("0 converted, 0 already current, 4 with nothing to convert, 0 failed\n",
              other.Run({"upgrade", "-r", list}, trees).out);
    EXPECT_EQ("0 repaired, 4 with nothing to repair, 0 failed\n",
              other.Run({"repair", "-r", list}, trees).out);

    std::filesystem::create_directory(At("to"));
    EXPECT_THAT(share_.Run({"cp", "-r", list, At("to")}, both), Succeeded());
    EXPECT_EQ("v", share_.Run({"get", At("to/b/file"), "user.k"}).out);
    EXPECT_THAT(share_.Run({"mv", list, "-t", At("to")}, a + '\0'), Succeeded());
    EXPECT_EQ("v", share_.Run({"get", At("to/file"), "user.k"}).out);
    EXPECT_FALSE(Exists(a));
    EXPECT_THAT(share_.Run({"rm", "-r", list}, both), Succeeded());
    EXPECT_THAT(NamesIn(share_.path()), ElementsAre("file.txt", "to"));
}

TEST_F(ManyPathsTest, WhatIsNoPathIsToldByItsNumberAndTheOthersAreTaken) {
    const std::string one = MakeWithAttribute("one");
    const std::string two = MakeWithAttribute("two");
    const std::string names = '\0' + one + '\0' + std::string(4096, 'n') + '\0' +
                              std::string(200'000, 'm') + '\0' + two + '\0' + '\0';
    const ToolResult result = share_.Run({"list", "-0", "--files0-from=-"}, names);
    EXPECT_EQ(one + '\0' + "user.k" + '\0' + two + '\0' + "user.k" + '\0', result.out);
    const std::string empty = "invalid zero-length file name; put nothing but one NUL between two ";
    EXPECT_THAT(result,
                Failed(2, "-:1: " + empty +
                              "paths\n"
                              "mavoea: -:3: File name too long; use a shorter name or path\n"
                              "mavoea: -:4: File name too long; use a shorter name or path\n"
                              "mavoea: -:6: " +
                              empty + "paths"));
    // The longest that is possible is one that is not there.
    const std::string longest = '/' + std::string(4094, '/');
    EXPECT_THAT(share_.Run({"list", "--files0-from=-"}, longest + '\0').err,
                Not(HasSubstr("too long")));

    const ToolResult rm = share_.Run({"rm", "--files0-from=-"}, one + '\0' + '\0' + two);
    EXPECT_EQ(1, rm.status);
    EXPECT_THAT(rm.err, HasSubstr("-:2: invalid zero-length file name"));
    EXPECT_FALSE(Exists(one) || Exists(two));
}

TEST_F(ManyPathsTest, AListThatCannotBeReadIsAFailure) {
    const std::string missing = At("missing");
    EXPECT_THAT(share_.Run({"list", "--files0-from", missing}),
                Failed(2, missing + ": No such file or directory; check the path"));
    EXPECT_THAT(share_.Run({"list", "--files0-from", share_.path()}).err,
                StartsWith("mavoea: " + share_.path() + ": Is a directory; "));
    for (const char* command : {"rm", "cp", "mv"}) {
        const Arguments words = {command, "--files0-from", missing};
        Arguments with_target = words;
        with_target.insert(with_target.end(), {"-t", share_.path()});
        const ToolResult result = share_.Run(command[0] == 'r' ? words : with_target);
        EXPECT_THAT(result, Failed(1, missing + ": No such file or directory; check the path"));
    }
}

TEST_F(ManyPathsTest, AListComesInPlaceOfPaths) {
    for (const char* command : {"list", "lock", "unlock", "upgrade", "repair"}) {
        EXPECT_THAT(share_.Run({command, share_.object(), "--files0-from=-"}),
                    Failed(2, "PATH excludes --files0-from; mavoea --help has the usage"));
    }
    EXPECT_THAT(share_.Run({"clean", share_.path(), "--files0-from=-"}),
                Failed(2, "DIR excludes --files0-from; mavoea --help has the usage"));
    const std::string object = share_.object();
    const struct {
        Arguments arguments;
        std::string message;
    } cases[] = {
        {{"rm", object}, "extra operand '" + object + '\''},
        {{"cp", object, share_.path()}, "extra operand '" + share_.path() + '\''},
        {{"mv", object, "-t", share_.path()}, "extra operand '" + object + '\''},
        {{"cp"}, "missing destination file operand"},
        {{"cp", "-T", share_.path()},
         "cannot combine --files0-from and --no-target-directory (-T)"},
        // It cannot answer questions as well.
        {{"rm", "-i"}, "standard input cannot both have the files and answer questions"},
        {{"rm", "-I"}, "standard input cannot both have the files and answer questions"},
        {{"cp", "-i", share_.path()},
         "standard input cannot both have the files and answer questions"},
    };
    for (const auto& one : cases) {
        Arguments arguments = one.arguments;
        arguments.insert(arguments.begin() + 1, "--files0-from=-");
        const ToolResult result = share_.Run(arguments, object + '\0');
        EXPECT_EQ(1, result.status);
        EXPECT_THAT(result.err, StartsWith("mavoea: " + one.message + '\n'));
    }
    EXPECT_EQ(Ascii("data"), ReadFile(object));
}

TEST_F(ManyPathsTest, APromptIsNotAnsweredByTheList) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    ASSERT_EQ(0, chmod(share_.path().c_str(), 0777));
    ASSERT_EQ(0, chmod(share_.object().c_str(), 0444));
    AsUser(1234, Root::kGivenUp, [&] {
        RunningTool tool(With({"rm", "---presume-input-tty", "--files0-from=-"}));
        tool.Answer(share_.object() + '\0');
        ASSERT_TRUE(tool.WaitFor("remove write-protected regular file"));
        tool.Answer("y\n");
        tool.EndInput();
        EXPECT_EQ(1, tool.Wait());
        EXPECT_THAT(tool.said(), HasSubstr("cannot remove 'y\\x0A': No such file or directory"));
    });
    EXPECT_TRUE(Exists(share_.object()));
}

// The next path is written when all of the one before has been heard.
TEST_F(ManyPathsTest, PathsAreTakenAsTheyCome) {
    const std::string one = MakeWithAttribute("one");
    const std::string two = MakeWithAttribute("two");
    RunningTool tool(With({"list", "--json", "--files0-from=-"}), RunningTool::Output::kSaid);
    for (const std::string& path : {one, two}) {
        tool.Answer(path + '\0');
        ASSERT_TRUE(tool.WaitFor("{\"path\":\"" + path + '"'));
        ASSERT_TRUE(tool.WaitFor("}]}\n"));
    }
    tool.EndInput();
    EXPECT_EQ(0, tool.Wait());
}

// Of the last path, the end has not come.
TEST_F(ManyPathsTest, CtrlCEndsWaitingForMorePaths) {
    const std::string one = Make("one");
    const std::string two = Make("two");
    RunningTool tool(With({"rm", "-v", "--files0-from=-"}), RunningTool::Output::kSaid);
    tool.Answer(one + '\0' + two);
    ASSERT_TRUE(tool.WaitFor("removed '" + one + "'\n"));
    tool.Signal(SIGINT);
    EXPECT_EQ(130, tool.Wait());
    EXPECT_TRUE(Exists(two));

    (void)MakeWithAttribute("a/gone");
    ASSERT_EQ(0, unlink(At("a/gone").c_str()));
    RunningTool clean(With({"clean", "--files0-from=-"}), RunningTool::Output::kSaid);
    clean.Answer(At("a") + '\0' + At("half a na"));
    ASSERT_TRUE(clean.WaitFor("its object is gone")) << clean.said();
    clean.Signal(SIGINT);
    EXPECT_EQ(130, clean.Wait());
    EXPECT_THAT(clean.said(), Not(HasSubstr("half")));
}

TEST_F(ManyPathsTest, AListMayBeLargerThanMemory) {
    constexpr std::size_t kCount = 20'000;
    constexpr std::size_t kLength = 4000;
    const std::string object = MakeWithAttribute("o");
    std::string path = share_.path();
    path += std::string(kLength - path.size() - 1, '/') + 'o';
    std::string names;
    for (std::size_t i = 0; i < kCount; i += SeriesStep()) names += path + '\0';
    const ToolResult result =
        share_.Run({"list", "-0", "--files0-from=-"}, names, {.memory = std::size_t{64} << 20});
    EXPECT_THAT(result, Succeeded());
    const std::string record = object + '\0' + "user.k" + '\0';
    EXPECT_EQ(names.size() / (kLength + 1) * record.size(), result.out.size());
    EXPECT_THAT(result.out, AllOf(StartsWith(record), EndsWith(record)));
}

// ---- Results for programs -----------------------------------------------------------------------

TEST_F(ManyPathsTest, NullRecordsArePairsOfAPathAndANameAsTheyAre) {
    const std::string object = share_.object();
    ASSERT_THAT(share_.Set("user.a\nb\\", Ascii("x")), Succeeded());
    ASSERT_THAT(share_.Set("user.c", Ascii("x")), Succeeded());
    const std::string records =
        object + '\0' + "user.a\nb\\" + '\0' + object + '\0' + "user.c" + '\0';
    for (const Arguments& arguments :
         {Arguments{"list", "-0", object}, Arguments{"list", "--null", object, At(".")},
          Arguments{"list", "-r0", share_.path()}}) {
        EXPECT_EQ(records, share_.Run(arguments).out);
    }
    EXPECT_EQ(2, share_.Run({"list", "-0", "-l", object}).status);
    EXPECT_EQ(2, share_.Run({"list", "-0", "--json", object}).status);
}

TEST_F(ManyPathsTest, JsonIsALineForEachObject) {
    const std::string one = MakeWithAttribute("directory/one\nname");
    const ToolResult result = share_.Run({"list", "-r", "--json", share_.path()});
    EXPECT_THAT(result, Succeeded());
    std::vector<std::string> paths;
    for (const std::string& line : Split(result.out, '\n')) {
        const auto json = nlohmann::json::parse(line);
        EXPECT_EQ(kAppleDouble, json["type"]);
        paths.push_back(json["path"]);
        if (json["path"] == one) {
            ASSERT_EQ(1U, json["attributes"].size());
            EXPECT_EQ("user.k", json["attributes"][0]["name"]);
            EXPECT_FALSE(json["attributes"][0].contains("base64"));
        } else {
            EXPECT_EQ(nlohmann::json::array(), json["attributes"]);
        }
    }
    EXPECT_THAT(paths, ElementsAre(share_.path(), At("directory"), share_.object(), one));
}

// Independent of the tool's: bit by bit.
Bytes FromBase64(const std::string& text) {
    const std::string letters = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    Bytes bytes;
    std::uint32_t bits = 0;
    int count = 0;
    for (const char c : text.substr(0, text.find('='))) {
        bits = (bits << 6 | static_cast<std::uint32_t>(letters.find(c))) & 0xFFFF;
        count += 6;
        if (count < 8) continue;
        count -= 8;
        bytes.push_back(static_cast<std::uint8_t>(bits >> count));
    }
    return bytes;
}

TEST_F(ManyPathsTest, ValuesAreBase64OnRequest) {
    const struct {
        const char* name;
        Bytes value;
        const char* base64;
    } cases[] = {{"user.0", {}, ""},
                 {"user.1", Hex("FF"), "/w=="},
                 {"user.2", Hex("FB EF"), "++8="},
                 {"user.3", Ascii("Man"), "TWFu"},
                 {"user.4", Ascii("Man!"), "TWFuIQ=="}};
    for (const auto& one : cases) ASSERT_THAT(share_.Set(one.name, one.value), Succeeded());
    const Bytes fork = Pattern(1'700'001);  // several pieces
    ASSERT_THAT(share_.Set("com.apple.ResourceFork", fork), Succeeded());
    ASSERT_THAT(share_.Set("mavoea.locked", Ascii("1")), Succeeded());
    const ToolResult result = share_.Run({"--json", "list", "--values", share_.object()});
    EXPECT_THAT(result, Succeeded());
    const auto attributes = result.json()["attributes"];
    ASSERT_EQ(7U, attributes.size());
    for (std::size_t i = 0; i < std::size(cases); ++i) {
        EXPECT_EQ(cases[i].name, attributes[i]["name"]);
        EXPECT_EQ(cases[i].base64, attributes[i]["base64"]);
    }
    EXPECT_EQ("resource fork", attributes[5]["kind"]);
    const std::string text = attributes[5]["base64"];
    EXPECT_EQ((fork.size() + 2) / 3 * 4, text.size());
    EXPECT_TRUE(fork == FromBase64(text));
    EXPECT_EQ("MQ==", attributes[6]["base64"]);
    EXPECT_EQ(2, share_.Run({"list", "--values", share_.object()}).status);
}

TEST_F(ManyPathsTest, AValueThatCannotBeReadLeavesTheLineWhole) {
    ASSERT_THAT(share_.Set("user.a", Ascii("value")), Succeeded());
    ASSERT_THAT(share_.Set("user.b", Ascii("value")), Succeeded());
    Bytes bytes = ReadFile(share_.apple_double());
    // The second value's length.
    PutU32(bytes, kTableAt + RecordSize(sizeof "user.a") + 4, 0xFFFFFFF0);
    WriteFile(share_.apple_double(), bytes);
    const ToolResult result = share_.Run({"list", "--json", "--values", share_.object()});
    EXPECT_EQ(2, result.status);
    ASSERT_EQ(1U, Split(result.out, '\n').size());
    const auto attributes = result.json()["attributes"];
    EXPECT_EQ("dmFsdWU=", attributes[0]["base64"]);
    EXPECT_FALSE(attributes[0].contains("problem"));
    EXPECT_EQ("", attributes[1]["base64"]);
    EXPECT_THAT(attributes[1]["problem"].get<std::string>(), HasSubstr("damaged"));
    // It is told once.
    EXPECT_EQ(1, std::count(result.err.begin(), result.err.end(), '\n'));
}

TEST_F(ManyPathsTest, ALargeForkIsNotHeldInMemory) {
    constexpr std::size_t kSize = std::size_t{96} << 20;
    ASSERT_THAT(share_.Set("com.apple.ResourceFork", Ascii("x")), Succeeded());
    Bytes head = ReadFile(share_.apple_double());
    const std::uint32_t fork_at = U32At(head, kForkOffsetAt);
    PutU32(head, kForkLengthAt, kSize);
    WriteFile(share_.apple_double(), head);
    ASSERT_EQ(0, truncate(share_.apple_double().c_str(), static_cast<off_t>(fork_at + kSize)));
    const ToolResult result = share_.Run({"list", "--json", "--values", share_.object()}, {},
                                         {.memory = std::size_t{64} << 20});
    EXPECT_THAT(result, Succeeded());
    const std::size_t begin = result.out.find("\"base64\":\"") + 10;
    EXPECT_EQ('e', result.out[begin]);  // of "x", and zeros behind it
    EXPECT_EQ(begin + kSize / 3 * 4, result.out.find('"', begin));
    EXPECT_THAT(result.out.substr(begin + kSize / 3 * 4), "\"}]}\n");
}

TEST_F(ManyPathsTest, MemoryDoesNotGrowWithTheObjectsThatAreListed) {
    constexpr int kDirectories = 30;
    constexpr int kObjects = 200;
    const Volume share(kAppleDouble, FastDirectory());
    ASSERT_THAT(share.Set("user.k", Ascii("value")), Succeeded());
    const Bytes sidecar = ReadFile(share.apple_double());
    for (int i = 0; i < kDirectories; i += static_cast<int>(SeriesStep())) {
        const std::string directory = share.path() + '/' + std::to_string(i);
        std::filesystem::create_directory(directory);
        for (int j = 0; j < kObjects; ++j) {
            WriteFile(directory + '/' + std::to_string(j), {});
            WriteFile(directory + "/._" + std::to_string(j), sidecar);
        }
    }
    // What a run with one object can do with.
    constexpr std::size_t kStep = std::size_t{1} << 20;
    std::size_t memory = 4 * kStep;
    const Arguments one = {"list", "--json", "--values", share.object()};
    while (share.Run(one, {}, {.memory = memory}).status != 0) {
        memory += kStep;
        ASSERT_LT(memory, std::size_t{256} << 20);
    }
    // What several processes have done waits for its turn, on a busy machine for longer.
    EXPECT_THAT(share.Run({"list", "-r", "-j", "1", "--json", "--values", share.path()}, {},
                          {.memory = memory + 2 * kStep}),
                Succeeded());
}

// ---- Shards -------------------------------------------------------------------------------------

// Written down once more: FNV-1a of 64 bits, and the finaliser.
std::uint64_t HashOf(const std::string& path) {
    std::uint64_t hash = 14695981039346656037U;
    for (const char c : path) {
        hash ^= static_cast<unsigned char>(c);
        hash *= 1099511628211U;
    }
    hash ^= hash >> 33;
    hash *= 0xff51afd7ed558ccdU;
    hash ^= hash >> 33;
    hash *= 0xc4ceb9fe1a85ec53U;
    hash ^= hash >> 33;
    return hash;
}

std::string ShardOf(const std::string& path, std::uint64_t count) {
    return std::to_string(HashOf(path) % count + 1) + '/' + std::to_string(count);
}

class ShardTest : public ManyPathsTest {
 protected:
    // Deep and wide, with names of odd bytes.
    void MakeTree() const {
        const Bytes sidecar = [&] {
            EXPECT_THAT(share_.Set("user.k", Ascii("value")), Succeeded());
            return ReadFile(share_.apple_double());
        }();
        const auto make = [&](const std::string& directory, const std::string& name) {
            WriteFile(directory + '/' + name, {});
            WriteFile(directory + "/._" + name, sidecar);
        };
        std::filesystem::create_directory(At("tree"));
        std::filesystem::create_directory(At("tree/wide"));
        for (int i = 0; i < 500; ++i) make(At("tree/wide"), std::to_string(i));
        std::string deep = At("tree/deep");
        for (int i = 0; i < 60; ++i) {
            std::filesystem::create_directory(deep);
            make(deep, "f");
            deep += "/d";
        }
        for (int byte = 1; byte < 256; ++byte) {
            if (byte != '/' && byte != '.') {
                make(At("tree"), std::string(1, static_cast<char>(byte)));
            }
        }
    }

    // The tool's output parts, each of one shard.
    std::vector<std::vector<std::string>> Shards(int count, Arguments arguments, char end) const {
        std::vector<std::vector<std::string>> all;
        for (int i = 1; i <= count; ++i) {
            Arguments with = arguments;
            with.insert(with.end(), {"--shard", std::to_string(i) + '/' + std::to_string(count)});
            const ToolResult result = share_.Run(with);
            EXPECT_THAT(result, Succeeded());
            all.push_back(Split(result.out, end));
        }
        return all;
    }

    static std::vector<std::string> Union(const std::vector<std::vector<std::string>>& shards) {
        std::vector<std::string> all;
        for (const auto& shard : shards) all.insert(all.end(), shard.begin(), shard.end());
        return Sorted(all);
    }
};

TEST_F(ShardTest, EachObjectIsInOneShardAndNoneInTwo) {
    MakeTree();
    const Arguments words = {"list", "-r", "--json", "--values", At("tree")};
    const auto whole = Split(share_.Run(words).out, '\n');
    ASSERT_EQ(1U + 1 + 500 + 2 * 60 + 253, whole.size());
    for (const int count : {1, 2, 5}) {
        const auto shards = Shards(count, words, '\n');
        EXPECT_EQ(Sorted(whole), Union(shards));
        for (const auto& shard : shards) {
            EXPECT_GT(shard.size(), whole.size() / static_cast<std::size_t>(2 * count));
        }
    }
}

// Those of objects and those of directories as a whole.
TEST_F(ShardTest, EachFindingIsSaidByOneShard) {
    MakeTree();
    for (int i = 0; i < 500; i += 10) {
        const std::string name = At("tree/wide/") + std::to_string(i);
        if (i % 20 == 0) {
            std::filesystem::remove(name);  // its metadata dangles
        } else {
            ASSERT_EQ(0, truncate(At("tree/wide/._" + std::to_string(i)).c_str(), 80));
        }
    }
    const auto whole = Split(share_.Run({"check", "-r", At("tree")}).out, '\n');
    ASSERT_LE(50U, whole.size());
    std::vector<std::string> all;
    for (const char* shard : {"1/3", "2/3", "3/3"}) {
        const ToolResult result = share_.Run({"check", "-r", "--shard", shard, At("tree")});
        EXPECT_EQ("", result.err);
        for (const std::string& line : Split(result.out, '\n')) all.push_back(line);
    }
    EXPECT_EQ(Sorted(whole), Sorted(all));
}

TEST_F(ShardTest, AllCommandsForTreesTakeShards) {
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(share_.path());
    MakeTree();
    constexpr int kObjects = 1 + 1 + 500 + 2 * 60 + 253;
    const auto locked = [&](const char* text) {
        const auto values = Split(share_.Run({"list", "-r0", At("tree")}).out, '\0');
        return std::count(values.begin(), values.end(), text);
    };
    (void)Shards(3, {"lock", "-r", At("tree")}, '\n');
    EXPECT_EQ(kObjects, locked("mavoea.locked"));
    ASSERT_THAT(share_.Run({"unlock", "-r", "--shard", "2/3", At("tree")}), Succeeded());
    const auto left = locked("mavoea.locked");
    EXPECT_GT(left, 0);
    EXPECT_LT(left, kObjects);
    (void)Shards(3, {"unlock", "-r", At("tree")}, '\n');
    EXPECT_EQ(0, locked("mavoea.locked"));

    const Volume other(1);
    for (int i = 0; i < 100; ++i) WriteFile(other.path() + '/' + std::to_string(i), {});
    for (const auto& [command, before] : {std::pair("upgrade", "0 converted, 0 already current, "),
                                          std::pair("repair", "0 repaired, ")}) {
        int sum = 0;
        for (const char* shard : {"1/2", "2/2"}) {
            const ToolResult result = other.Run({command, "-r", "--shard", shard, other.path()});
            EXPECT_THAT(result, Succeeded());
            ASSERT_THAT(result.out, StartsWith(before));
            sum += std::stoi(result.out.substr(std::string(before).size()));
        }
        EXPECT_EQ(102, sum);  // with the directory and a file of its own
    }
}

// All of them make EA directories in the same directories.
TEST_F(ShardTest, ShardsThatRunAtATimeDoEachObjectOnce) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(share_.path());
    const Volume other(1);
    constexpr int kDirectories = 20;
    constexpr int kObjects = 10;
    for (int i = 0; i < kDirectories; ++i) {
        const std::string directory = other.path() + '/' + std::to_string(i);
        std::filesystem::create_directory(directory);
        for (int j = 0; j < kObjects; ++j) WriteFile(directory + '/' + std::to_string(j), {});
    }
    constexpr int kCount = 4;
    std::vector<std::unique_ptr<RunningTool>> tools;
    for (int i = 1; i <= kCount; ++i) {
        tools.push_back(std::make_unique<RunningTool>(
            Arguments{"--volume", other.path() + "=1", "lock", "-r", "--json", "--shard",
                      std::to_string(i) + '/' + std::to_string(kCount), other.path()},
            RunningTool::Output::kSaid));
    }
    std::multiset<std::string> locked;
    for (const auto& tool : tools) {
        EXPECT_EQ(0, tool->Wait());
        for (const auto& entry : nlohmann::json::parse(tool->said())) locked.insert(entry["path"]);
    }
    EXPECT_EQ(2U + kDirectories * (1 + kObjects), locked.size());
    std::multiset<std::string> listed;
    const auto words = Split(other.Run({"list", "-r0", other.path()}).out, '\0');
    for (std::size_t i = 0; i + 1 < words.size(); i += 2) {
        EXPECT_EQ("mavoea.locked", words[i + 1]);
        listed.insert(words[i]);
    }
    EXPECT_EQ(listed, locked);
}

// The values are those of docs/sharding.md.
TEST_F(ShardTest, TheHashIsThatOfThePathFromTheLastNameThatWasNamed) {
    EXPECT_EQ(0xEFD01F60BA992926U, HashOf(""));
    EXPECT_EQ(0x82A2A958A9BECE5BU, HashOf("a"));
    EXPECT_EQ(0xE632AE8FA0A69E61U, HashOf("share"));
    EXPECT_EQ(0x8DFDCBF138D48558U, HashOf("share/letters/a.txt"));
    EXPECT_EQ(0x758787D4F71BF399U, HashOf("share/\xFF\n\xC3\xA9"));
    const std::string letter = MakeWithAttribute("share/letters/a.txt");
    const std::string odd = MakeWithAttribute("share/\xFF\n\xC3\xA9");
    const auto paths_in = [&](const Arguments& words, const std::string& shard) {
        Arguments with = {"list", "-0", "--shard", shard};
        with.insert(with.end(), words.begin(), words.end());
        return share_.Run(with).out;
    };
    const Arguments tree = {"-r", At("share")};
    EXPECT_EQ(letter + '\0' + "user.k" + '\0', paths_in(tree, "9/16"));
    EXPECT_EQ(odd + '\0' + "user.k" + '\0', paths_in(tree, "10/16"));
    const struct {
        Arguments words;
        std::string hashed;
    } cases[] = {{tree, "share/letters/a.txt"},
                 {{"-r", At("share//")}, "share/letters/a.txt"},
                 {{"-r", At("share/letters")}, "letters/a.txt"},
                 {{"-r", At("share/.")}, "letters/a.txt"},
                 {{"-r", At("share/letters/..")}, "letters/a.txt"},
                 {{"-r", At("share/letters/.")}, "a.txt"},
                 {{letter}, "a.txt"}};
    constexpr std::uint64_t kCount = 1'000'000;
    for (const auto& [words, hashed] : cases) {
        EXPECT_EQ(letter + '\0' + "user.k" + '\0', paths_in(words, ShardOf(hashed, kCount)));
    }
}

TEST_F(ShardTest, WhatIsNoShardIsRefused) {
    for (const char* text : {"0/2", "3/2", "1/0", "1", "/", "1/", "/2", "-1/2", "1/2/3",
                             "1/1000001", "4294967297/4294967297", " 1/2", "1/2 ", "+1/2", ""}) {
        EXPECT_THAT(
            share_.Run({"list", "--shard", text, share_.object()}),
            Failed(2, "--shard: " + std::string(text) + " is no I/N; mavoea --help has the usage"));
    }
}

TEST_F(ShardTest, AnUnreadableDirectoryIsToldByItsShardAndFailsAll) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    for (const std::string& path : {share_.path(), At("tree")}) {
        std::filesystem::create_directory(path);
        ASSERT_EQ(0, chmod(path.c_str(), 0755));
    }
    for (const char* name : {"tree/closed", "tree/barred"}) {
        std::filesystem::create_directory(At(name));
        ASSERT_EQ(0, chmod(At(name).c_str(), 0));
    }
    const std::uint64_t closed = HashOf("tree/closed") % 3;
    const std::uint64_t barred = HashOf("tree/barred") % 3;
    ASSERT_NE(closed, barred);  // else there is less to see
    for (std::uint64_t i = 0; i < 3; ++i) {
        const std::string shard = std::to_string(i + 1) + "/3";
        const ToolResult result =
            share_.Run({"list", "-r", "--shard", shard, At("tree")}, {}, {.user = 1234});
        EXPECT_EQ(2, result.status);
        EXPECT_EQ(i == closed, result.err.find(At("tree/closed: ")) != std::string::npos);
        EXPECT_EQ(i == barred, result.err.find(At("tree/barred: ")) != std::string::npos);
        const bool one = i == closed || i == barred;
        EXPECT_THAT(result.err, EndsWith("mavoea: shard " + shard +
                                         (one ? ": 1 path of other shards could not be looked "
                                                "into; see what these say of it\n"
                                              : ": 2 paths of other shards could not be looked "
                                                "into; see what these say of them\n")));
    }
}

TEST_F(ShardTest, AVolumeThatDoesNotSuitIsToldByOneShardAndFailsAll) {
    for (const char* name : {"a", "b", "c"}) Make(std::string("tree/") + name);
    int told = 0;
    for (const char* shard : {"1/2", "2/2"}) {
        const ToolResult result = share_.Run({"upgrade", "-r", "--shard", shard, At("tree")});
        EXPECT_EQ(2, result.status);
        EXPECT_EQ("0 converted, 0 already current, 0 with nothing to convert, 1 failed\n",
                  result.out);
        if (result.err.find("keep no EA directory") != std::string::npos) ++told;
    }
    EXPECT_EQ(1, told);
}

// ---- How far it is ------------------------------------------------------------------------------

TEST_F(ManyPathsTest, ProgressIsALineInTheIntervalWhereThereIsNoTerminal) {
    const std::string tree = At("tree");
    const std::string file = Make("tree/file");
    const ToolResult result = share_.Run({"list", "-r", "--progress=0", tree});
    EXPECT_EQ(0, result.status);
    const auto lines = Split(result.err, '\n');
    ASSERT_EQ(2U, lines.size());
    EXPECT_THAT(lines[0],
                AllOf(StartsWith("mavoea: listing: 0 done, 0 failed, "), EndsWith("/s, " + tree)));
    EXPECT_THAT(lines[1],
                AllOf(StartsWith("mavoea: listing: 1 done, 0 failed, "), EndsWith("/s, " + file)));
    // Nobody waits for half a minute, or an hour.
    EXPECT_THAT(share_.Run({"list", "-r", "--progress", tree}), Succeeded());
    EXPECT_THAT(share_.Run({"list", "-r", "--progress=3600", tree}), Succeeded());
    for (const char* interval : {"-1", "x", "86401", "1.5"}) {
        EXPECT_EQ(2, share_.Run({"list", std::string("--progress=") + interval, tree}).status)
            << interval;
    }
    for (const char* interval : {"-1", "x", "", "123456"}) {
        EXPECT_EQ(1, share_.Run({"rm", std::string("--progress=") + interval, tree}).status)
            << interval;
    }
}

TEST_F(ManyPathsTest, AllRecursiveCommandsHaveProgress) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(share_.path());
    const Volume other(1);
    const std::string tree = At("tree");
    const std::string copy = At("copy");
    (void)Make("tree/file");
    const struct {
        const Volume& volume;
        Arguments arguments;
        std::string said;
    } cases[] = {
        {share_, {"list", "-r", tree}, "listing: 1 done, 0 failed, "},
        {share_, {"lock", "-r", tree}, "locking: 1 done, 0 failed, "},
        {share_, {"unlock", "-r", tree}, "unlocking: 1 done, 0 failed, "},
        {other, {"upgrade", "-r", other.path()}, "upgrading: 1 done, "},
        {other, {"repair", "-r", other.path()}, "repairing: 1 done, "},
        {share_, {"clean", "-r", share_.path()}, "looking for metadata: 1 directories, "},
        {share_, {"cp", "-r", tree, copy}, "copying: 0 copied"},
        {share_, {"carry", "-r", tree, copy}, "carrying: 0 carried"},
        {share_, {"convert", "-r", "--to", "0", tree, At("converted")}, "converting: 0 converted"},
        {share_, {"rm", "-r", tree}, "removing: 1 removed, 0 failed, "},
        {share_, {"mv", copy, tree}, "moving: 0 moved"},
    };
    for (const auto& one : cases) {
        Arguments arguments = one.arguments;
        arguments.insert(arguments.begin() + 1, "--progress=0");
        const ToolResult result = one.volume.Run(arguments);
        EXPECT_EQ(0, result.status) << result.err;
        EXPECT_THAT(result.err, HasSubstr("mavoea: " + one.said));
        arguments.erase(arguments.begin() + 1);
    }
}

TEST_F(ManyPathsTest, AProgressLineComesOnRequest) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const std::string one = MakeWithAttribute("one");
    const std::string two = MakeWithAttribute("two");
    const std::string target = At("target");
    std::filesystem::create_directory(target);
    const struct {
        Arguments arguments;
        std::string heard;  // when the first path is done
        std::string said;
    } cases[] = {
        {{"list"}, "user.k\n", "listing: 1 done, 0 failed, "},
        {{"cp", "-v", "-t", target}, "one'\n", "copying: 1 copied"},
        {{"rm", "-v"}, "one'\n", "removing: 2 removed, 0 failed, "},
    };
    for (const auto& [arguments, heard, said] : cases) {
        Arguments words = With(arguments);
        words.emplace_back("--files0-from=-");
        RunningTool tool(words, RunningTool::Output::kSaid);
        tool.Answer(one + '\0');
        ASSERT_TRUE(tool.WaitFor(heard));
        tool.Signal(SIGUSR1);
        tool.Answer(two + '\0');
        ASSERT_TRUE(tool.WaitFor("mavoea: " + said)) << tool.said();
        ASSERT_TRUE(tool.WaitFor("/s, " + two + '\n')) << tool.said();
        tool.EndInput();
        EXPECT_EQ(0, tool.Wait());
        // Asked once, it is told once.
        EXPECT_THAT(tool.said(), Not(HasSubstr("/s, ")));
    }
}

}  // namespace
}  // namespace mavoea::test

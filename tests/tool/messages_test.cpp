// What the tool says when something is wrong.

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <string_view>

#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::ContainsRegex;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

// ---- Commands that there are not ----------------------------------------------------------------

TEST(UnknownCommandTest, TheNearestKnownOneIsNamed) {
    const Volume volume(0);
    const struct {
        std::string word;
        std::string nearest;
    } cases[] = {{"lst", "list"},         {"lists", "list"},        {"gett", "get"},
                 {"whre", "where"},       {"remov", "remove"},      {"unlok", "unlock"},
                 {"imprt", "import"},     {"upgrde", "upgrade"},    {"repiar", "repair"},
                 {"converrt", "convert"}, {"claen", "clean"},       {"dumpp", "dump"},
                 {"locc", "lock"},        {"upgradeing", "upgrade"}};
    for (const auto& [word, nearest] : cases) {
        const ToolResult result = RunTool({word, volume.object()});
        EXPECT_THAT(result, Failed(2, word + ": unknown command, the nearest is \"" + nearest +
                                          "\"; mavoea --help has all of them"));
        EXPECT_EQ("", result.out);
    }
    EXPECT_THAT(NamesIn(volume.path()), ElementsAre("file.txt"));
}

TEST(UnknownCommandTest, WhatIsNearNothingIsNamedAlone) {
    for (const std::string word : {"xyzzyplugh", "frobnicate", "/srv/share/letter.txt"}) {
        EXPECT_THAT(RunTool({word}),
                    Failed(2, word + ": unknown command; mavoea --help has all of them"));
        EXPECT_THAT(RunTool({word, "list", "x"}),
                    Failed(2, word + ": unknown command; mavoea --help has all of them"));
    }
}

TEST(UnknownCommandTest, OptionsInFrontOfItAreNoneOfItsBusiness) {
    const Volume volume(0);
    const std::string message =
        "lst: unknown command, the nearest is \"list\"; mavoea --help has all of them";
    EXPECT_THAT(RunTool({"--json", "lst", volume.object()}), Failed(2, message));
    EXPECT_THAT(RunTool({"--volume", volume.path() + "=0", "lst", volume.object()}),
                Failed(2, message));
    EXPECT_THAT(RunTool({"lst", "-l", volume.object()}), Failed(2, message));
    EXPECT_THAT(RunTool({"lst", "--bogus", volume.object()}), Failed(2, message));
}

TEST(UnknownCommandTest, ItStaysInOneLineWhateverItIsMadeOf) {
    EXPECT_THAT(RunTool({"xyzzy\nplugh\x1B[2J"}),
                Failed(2,
                       "xyzzy\\x0Aplugh\\x1B[2J: unknown command; mavoea --help has all of "
                       "them"));
}

// ---- Causes -------------------------------------------------------------------------------------

TEST(MessagesTest, NoneLeavesTheCauseToTheSystemLog) {
    const Bytes program = ReadFile(Tested().path);
    ASSERT_LT(10000U, program.size());
    for (const std::string_view words : {"the system log has the cause", "system log has"}) {
        EXPECT_EQ(program.end(),
                  std::search(program.begin(), program.end(), words.begin(), words.end()))
            << words;
    }
    const std::string_view words = "Exit status:";
    EXPECT_NE(program.end(),
              std::search(program.begin(), program.end(), words.begin(), words.end()))
        << "texts lie in the program as they are";
}

// Objects of the superuser's that another user asks about.
class ForbiddenTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_WITHOUT_OTHER_USERS();
        ASSERT_EQ(0, chmod(volume_.path().c_str(), 0755));
        ASSERT_EQ(0, mkdir(closed().c_str(), 0755));
        WriteFile(closed() + "/file", Ascii("data"));
    }

    std::string closed() const { return volume_.path() + "/closed"; }
    std::string ea_directory() const { return volume_.path() + "/@eaDir"; }

    // Each of the commands ends with status 2 and one line about something at or below `path`.
    void ExpectRefusal(const std::string& path, const std::vector<Arguments>& commands) const {
        AsUser(1234, Root::kGivenUp, [&] {
            for (const Arguments& command : commands) {
                SCOPED_TRACE(command.front() + ' ' + command.back());
                const ToolResult result = volume_.Run(command);
                EXPECT_EQ(2, result.status);
                EXPECT_EQ("", result.out);
                EXPECT_THAT(result.err,
                            AllOf(StartsWith("mavoea: " + path), HasSubstr("Permission denied"),
                                  ContainsRegex("; [^\n]+\n$"), Not(ContainsRegex("\n."))));
            }
        });
    }

    const Volume volume_{GetParam()};
};
std::string NameOf(const ::testing::TestParamInfo<int>& tested) {
    return "Type" + std::to_string(tested.param);
}
INSTANTIATE_TEST_SUITE_P(EveryKind, ForbiddenTest, ::testing::ValuesIn(Types({0, 1, 2, 7})),
                         NameOf);

TEST_P(ForbiddenTest, AnObjectInADirectoryThatMayNotBeEnteredIsNotListed) {
    ASSERT_EQ(0, chmod(closed().c_str(), 0700));
    const std::string path = closed() + "/file";
    ExpectRefusal(path + ": ",
                  {{"list", path}, {"list", "-l", path}, {"get", path, "a"}, {"where", path}});
    const std::string missing = closed() + "/none";
    ExpectRefusal(missing + ": ", {{"list", missing}, {"get", missing, "a"}});
}

TEST_P(ForbiddenTest, OfSeveralObjectsTheOthersAreListed) {
    ASSERT_EQ(0, chmod(closed().c_str(), 0700));
    AsUser(1234, Root::kGivenUp, [&] {
        const ToolResult result = volume_.Run({"list", closed() + "/file", volume_.object()});
        EXPECT_EQ(2, result.status);
        EXPECT_EQ(volume_.object() + ":\n", result.out);
        EXPECT_THAT(result.err, HasSubstr(closed() + "/file: Permission denied; "));
    });
}

// On the kinds that keep it in files.
class ForbiddenFilesTest : public ForbiddenTest {};
INSTANTIATE_TEST_SUITE_P(KindsWithFiles, ForbiddenFilesTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         NameOf);

TEST_P(ForbiddenFilesTest, MetadataThatMayNotBeReadIsNotMissing) {
    if (GetParam() != 0) {
        ASSERT_EQ(0, mkdir(ea_directory().c_str(), 0777));
    }
    WriteFile(volume_.attribute_file(),
              StreamImage{.attributes = {{"colour", Ascii("blue")}}}.Build());
    ASSERT_EQ(0, chmod(volume_.attribute_file().c_str(), 0600));
    const std::string object = volume_.object();
    ExpectRefusal(volume_.path() + "/",
                  {{"list", object}, {"get", object, "colour"}, {"get", object, "other"}});
}

class ForbiddenDirectoryTest : public ForbiddenTest {};
INSTANTIATE_TEST_SUITE_P(KindsWithDirectories, ForbiddenDirectoryTest,
                         ::testing::ValuesIn(Types({1, 2})), NameOf);

TEST_P(ForbiddenDirectoryTest, AnEaDirectoryThatMayNotBeEnteredIsNotMissing) {
    ASSERT_EQ(0, mkdir(ea_directory().c_str(), 0700));
    const std::string object = volume_.object();
    ExpectRefusal(volume_.path() + "/", {{"list", object}, {"get", object, "colour"}});
}

}  // namespace
}  // namespace mavoea::test

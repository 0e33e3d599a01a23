// mavoea rm, on real files.

#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class RmKindTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    }
    const Travel travel_{GetParam(), GetParam()};
};
INSTANTIATE_TEST_SUITE_P(EveryKind, RmKindTest,
                         ::testing::Values(kAppleDouble, kEaDirectory, kFileEa, kXattr));

TEST_P(RmKindTest, FilesGoWithTheirMetadata) {
    for (const std::string& name : DifficultNames()) {
        SCOPED_TRACE(name);
        travel_.MakeFile(travel_.From(name));
        travel_.GiveMetadata(travel_.From(name));
        EXPECT_THAT(travel_.Run({"rm", travel_.From(name)}), Succeeded());
        EXPECT_THAT(NamesIn(travel_.source()), ElementsAre());
    }
}

TEST_P(RmKindTest, TheMetadataOfOthersStays) {
    travel_.MakeFile(travel_.From("a"));
    travel_.MakeFile(travel_.From("b"));
    travel_.GiveMetadata(travel_.From("a"));
    travel_.GiveMetadata(travel_.From("b"));
    EXPECT_THAT(travel_.Run({"rm", travel_.From("a")}), Succeeded());
    travel_.ExpectMetadata(travel_.From("b"));
    travel_.MakeFile(travel_.From("a"));
    travel_.ExpectNoMetadata(travel_.From("a"));
}

TEST_P(RmKindTest, TreesGoWithAllThatIsInThem) {
    mkdir(travel_.From("tree").c_str(), 0755);
    mkdir(travel_.From("tree/sub").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/sub/file"));
    travel_.GiveMetadata(travel_.From("tree"));
    travel_.GiveMetadata(travel_.From("tree/sub"));
    travel_.GiveMetadata(travel_.From("tree/sub/file"));
    const ToolResult result = travel_.Run({"rm", "-r", travel_.From("tree")});
    EXPECT_THAT(result, Succeeded());
    EXPECT_EQ("", result.out);
    EXPECT_THAT(NamesIn(travel_.source()), ElementsAre());
}

class RmTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    }
    const Travel travel_{kEaDirectory, kEaDirectory};
};

TEST_F(RmTest, WhatBelongsToNoObjectGoesWithItsDirectory) {
    mkdir(travel_.From("tree").c_str(), 0755);
    mkdir(travel_.From("tree/@eaDir").c_str(), 0777);
    mkdir(travel_.From("tree/@eaDir/gone").c_str(), 0777);
    travel_.MakeFile(travel_.From("tree/@eaDir/gone/MAVOPHOTO:THUMB"));
    travel_.MakeFile(travel_.From("tree/._gone"));
    EXPECT_THAT(travel_.Run({"rm", "-r", travel_.From("tree")}), Succeeded());
    EXPECT_FALSE(Exists(travel_.From("tree")));
}

TEST_F(RmTest, LinksAreNotFollowed) {
    mkdir(travel_.From("tree").c_str(), 0755);
    mkdir(travel_.From("other").c_str(), 0755);
    travel_.MakeFile(travel_.From("other/a"));
    ASSERT_EQ(0, symlink("../other", travel_.From("tree/link").c_str()));
    mkdir(travel_.From("tree/@eaDir").c_str(), 0777);
    ASSERT_EQ(0, symlink("../../other", travel_.From("tree/@eaDir/link").c_str()));
    ASSERT_EQ(0, symlink("other", travel_.From("link").c_str()));
    mkdir(travel_.From("@eaDir").c_str(), 0777);
    ASSERT_EQ(0, symlink("../other", travel_.From("@eaDir/link").c_str()));
    EXPECT_THAT(travel_.Run({"rm", "-r", travel_.From("tree"), travel_.From("link")}), Succeeded());
    EXPECT_THAT(NamesIn(travel_.source()), ElementsAre("other"));
    EXPECT_TRUE(Exists(travel_.From("other/a")));
}

TEST_F(RmTest, WithForceWhatIsMissingIsNoFailure) {
    EXPECT_THAT(travel_.Run({"rm", "-f", travel_.From("none")}), Succeeded());
    EXPECT_EQ(1, travel_.Run({"rm", "-f", "-i", travel_.From("none")}).status);
}

TEST_F(RmTest, AskingCoversEveryObject) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/a"));
    travel_.MakeFile(travel_.From("tree/b"));
    const ToolResult result = travel_.Run({"rm", "-riv", travel_.From("tree")}, "y\nn\ny\nn\n");
    EXPECT_EQ(0, result.status);
    EXPECT_EQ("mavoea: descend into directory '" + travel_.From("tree") +
                  "'? mavoea: remove regular file '" + travel_.From("tree/a") +
                  "'? mavoea: remove regular file '" + travel_.From("tree/b") +
                  "'? mavoea: remove directory '" + travel_.From("tree") + "'? ",
              result.err);
    EXPECT_EQ("removed '" + travel_.From("tree/b") + "'\n1 removed, 2 skipped, 0 failed\n",
              result.out);
    EXPECT_THAT(NamesIn(travel_.From("tree")), ElementsAre("a"));
    EXPECT_EQ(0, travel_.Run({"rm", "-ri", travel_.From("tree")}, "y\ny\ny\n").status);
    EXPECT_FALSE(Exists(travel_.From("tree")));
}

TEST_F(RmTest, AFailureInATreeDoesNotStopTheRest) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    mkdir(travel_.From("tree").c_str(), 0755);
    mkdir(travel_.From("tree/closed").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/closed/a"));
    travel_.MakeFile(travel_.From("tree/z"));
    for (const std::string& path : {travel_.dir().path(), travel_.source(), travel_.From("tree")}) {
        ASSERT_EQ(0, chmod(path.c_str(), 0777));
    }
    AsUser(1234, Root::kGivenUp, [&] {
        EXPECT_THAT(
            travel_.Run({"rm", "-r", travel_.From("tree")}),
            Failed(1, "cannot remove '" + travel_.From("tree/closed/a") +
                          "': Permission denied; run mavoea as a user who may, or as root"));
    });
    EXPECT_THAT(NamesIn(travel_.From("tree")), ElementsAre("closed"));
}

TEST_F(RmTest, AnInterruptEndsTheWorkBetweenObjects) {
    for (const char* name : {"a", "b"}) {
        travel_.MakeFile(travel_.From(name));
        travel_.GiveMetadata(travel_.From(name), name);
    }
    RunningTool tool(travel_.WithVolumes({"rm", "-i", travel_.From("a"), travel_.From("b")}));
    ASSERT_TRUE(tool.WaitFor(travel_.From("a") + "'? "));
    tool.Answer("y\n");
    ASSERT_TRUE(tool.WaitFor(travel_.From("b") + "'? "));
    tool.Signal(SIGTERM);
    EXPECT_EQ(143, tool.Wait());
    EXPECT_THAT(tool.said(), HasSubstr("interrupted: 1 removed, 0 failed"));
    EXPECT_THAT(Travel::ObjectsIn(travel_.source()), ElementsAre("b"));
    travel_.ExpectMetadata(travel_.From("b"), "b");
}

TEST_F(RmTest, VerboseAndJsonSayWhatWasRemoved) {
    mkdir(travel_.From("tree").c_str(), 0755);
    travel_.MakeFile(travel_.From("tree/a"));
    const auto json =
        travel_.Run({"--json", "rm", "-rv", travel_.From("tree"), travel_.From("none")}).json();
    EXPECT_EQ("removing", json["task"]);
    EXPECT_EQ(2, json["done"]);
    EXPECT_EQ(1, json["failed"]);
    EXPECT_EQ("removed '" + travel_.From("tree/a") + "'", json["lines"][0]["message"]);
    EXPECT_EQ("removed directory '" + travel_.From("tree") + "'", json["lines"][1]["message"]);
    EXPECT_EQ(travel_.From("none"), json["failures"][0]["path"]);
}

}  // namespace
}  // namespace mavoea::test

// mavoea rm asks and leaves alone as coreutils' rm does.

#include "tests/tool/habits.h"

namespace mavoea::test {
namespace {

using RmHabitsTest = HabitsTest;
INSTANTIATE_TEST_SUITE_P(VolumeTypes, RmHabitsTest, ::testing::ValuesIn(Types({0, 1, 2, 7})),
                         TypeName);

TEST_P(RmHabitsTest, ItAsksAsOftenAsItIsToldTo) {
    const auto left_of = [&](const Arguments& options, const std::string& answers) {
        for (const char* name : {"a", "b", "c", "d"}) Make(std::string("from/") + name, name);
        Arguments arguments = {"rm", "from/a", "from/b", "from/c", "from/d"};
        arguments.insert(arguments.begin() + 1, options.begin(), options.end());
        EXPECT_EQ(0, Run(arguments, answers).status);
        for (const std::string& name : Travel::ObjectsIn("from")) ExpectWhole("from/" + name, name);
        return Travel::ObjectsIn("from").size();
    };
    EXPECT_EQ(0U, left_of({}, ""));
    EXPECT_EQ(0U, left_of({"--interactive=never"}, "n\n"));
    EXPECT_EQ(4U, left_of({"--interactive=once"}, "n\n"));
    EXPECT_EQ(0U, left_of({"--interactive=once"}, "y\n"));
    EXPECT_EQ(4U, left_of({"-I"}, "n\n"));
    EXPECT_EQ(2U, left_of({"--interactive=always"}, "y\nn\ny\nn\n"));
    EXPECT_EQ(2U, left_of({"--interactive"}, "n\ny\nn\ny\n"));
    EXPECT_EQ(3U, left_of({"-i"}, "y\n"));
    EXPECT_EQ(0U, left_of({"-i", "-f"}, "n\n"));
    EXPECT_EQ(4U, left_of({"-f", "--inter=yes"}, ""));
    EXPECT_EQ(1, Run({"rm", "--interactive=perhaps", "from/a"}).status);
}

TEST_P(RmHabitsTest, ItLeavesWhatIsMountedWhereAllRootsArePreserved) {
    EXPECT_EQ(1, Run({"rm", "-r", "--preserve-root=some", "from"}).status);
    const MountedHere mounted("to");
    if (!mounted.ok()) GTEST_SKIP() << "takes the right to mount";
    WriteFile("to/a", Ascii("a"));
    EXPECT_EQ(1, Run({"rm", "-r", "--preserve-root=all", "to"}).status);
    EXPECT_TRUE(Exists("to/a"));
}

}  // namespace
}  // namespace mavoea::test

// mavoea carry: the metadata of objects onto copies that another program has made.

#include <fcntl.h>
#include <sys/stat.h>

#include <filesystem>

#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

class CarryTest : public ::testing::TestWithParam<std::pair<int, int>> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(travel_.dir().path());
    }

    // A copy of a file, as another program leaves it.
    void MakeCopy(const std::string& name) const {
        WriteFile(travel_.To(name), ReadFile(travel_.From(name)));
        ASSERT_EQ(0, chmod(travel_.To(name).c_str(), 0640));
        const timespec times[] = {{1'000'000'000, 5}, {1'100'000'000, 7}};
        ASSERT_EQ(0, utimensat(AT_FDCWD, travel_.To(name).c_str(), times, 0));
    }

    Travel travel_{GetParam().first, GetParam().second};
};

TEST_P(CarryTest, MetadataComesToACopyAndNothingElseOfItChanges) {
    travel_.MakeFile(travel_.From("a"));
    travel_.GiveMetadata(travel_.From("a"));
    MakeCopy("a");
    const struct stat before = StatusOf(travel_.To("a"));
    EXPECT_THAT(travel_.Run({"carry", travel_.From("a"), travel_.To("a")}), Succeeded());
    travel_.ExpectMetadata(travel_.To("a"));
    travel_.ExpectMetadata(travel_.From("a"));
    const struct stat after = StatusOf(travel_.To("a"));
    EXPECT_EQ("data", TextOf(travel_.To("a")));
    EXPECT_EQ(before.st_ino, after.st_ino);
    EXPECT_EQ(before.st_mode, after.st_mode);
    EXPECT_EQ(before.st_uid, after.st_uid);
    EXPECT_EQ(before.st_mtim.tv_sec, after.st_mtim.tv_sec);
    EXPECT_EQ(before.st_mtim.tv_nsec, after.st_mtim.tv_nsec);
}

TEST_P(CarryTest, WhatTheCopyHadBeforeGoes) {
    travel_.MakeFile(travel_.From("a"));
    travel_.GiveMetadata(travel_.From("a"));
    MakeCopy("a");
    ASSERT_EQ(0, travel_.Run({"set", travel_.To("a"), "user.former", "x"}).status);
    EXPECT_THAT(travel_.Run({"carry", travel_.From("a"), travel_.To("a")}), Succeeded());
    EXPECT_EQ(1, travel_.Run({"get", travel_.To("a"), "user.former"}).status);
    travel_.ExpectMetadata(travel_.To("a"));
}

TEST_P(CarryTest, ATreeGoesWithItsDirectoriesWhoseTimesStay) {
    for (const std::string& root : {travel_.source(), travel_.target()}) {
        std::filesystem::create_directory(root + "/tree");
        std::filesystem::create_directory(root + "/tree/inner");
    }
    travel_.MakeFile(travel_.From("tree/a"));
    travel_.MakeFile(travel_.From("tree/inner/b"));
    travel_.GiveMetadata(travel_.From("tree/a"), "blue");
    travel_.GiveMetadata(travel_.From("tree/inner/b"), "green");
    travel_.GiveMetadata(travel_.From("tree/inner"), "red");
    MakeCopy("tree/a");
    MakeCopy("tree/inner/b");
    const timespec times[] = {{1'000'000'000, 0}, {1'200'000'000, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, travel_.To("tree/inner").c_str(), times, 0));
    EXPECT_THAT(travel_.Run({"carry", "-r", travel_.From("tree"), travel_.To("tree")}),
                Succeeded());
    travel_.ExpectMetadata(travel_.To("tree/a"), "blue");
    travel_.ExpectMetadata(travel_.To("tree/inner/b"), "green");
    travel_.ExpectMetadata(travel_.To("tree/inner"), "red");
    EXPECT_EQ(1'200'000'000, StatusOf(travel_.To("tree/inner")).st_mtim.tv_sec);
}

TEST_P(CarryTest, WhatHasNoCopyIsNamedAndTheRestIsCarried) {
    for (const std::string& root : {travel_.source(), travel_.target()})
        std::filesystem::create_directory(root + "/tree");
    for (const char* name : {"tree/a", "tree/b", "tree/c"}) {
        travel_.MakeFile(travel_.From(name));
        travel_.GiveMetadata(travel_.From(name));
    }
    MakeCopy("tree/a");
    std::filesystem::create_directory(travel_.To("tree/c"));
    const ToolResult result =
        travel_.Run({"carry", "-r", travel_.From("tree"), travel_.To("tree")});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.err, HasSubstr(travel_.From("tree/b") + ": there is no copy of it at '"));
    EXPECT_THAT(result.err, HasSubstr("is no copy of it, but a directory"));
    EXPECT_FALSE(Exists(travel_.To("tree/b")));
    travel_.ExpectMetadata(travel_.To("tree/a"));
}

TEST_P(CarryTest, WhatMakesNoSenseIsRefused) {
    travel_.MakeFile(travel_.From("a"));
    EXPECT_EQ(1, travel_.Run({"carry", travel_.From("a"), travel_.From("a")}).status);
    EXPECT_NE(0, travel_.Run({"carry", travel_.From("none"), travel_.To("a")}).status);
    EXPECT_NE(0, travel_.Run({"carry", travel_.From("a"), travel_.To("none")}).status);
}

INSTANTIATE_TEST_SUITE_P(Pairs, CarryTest,
                         ::testing::Values(std::pair(kAppleDouble, kEaDirectory),
                                           std::pair(kEaDirectory, kAppleDouble),
                                           std::pair(kEaDirectory, kFileEa),
                                           std::pair(kFileEa, kEaDirectory),
                                           std::pair(kXattr, kXattr)));

}  // namespace
}  // namespace mavoea::test

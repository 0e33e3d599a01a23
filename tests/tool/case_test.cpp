// Volumes on which "a" and "A" are one name: no spelling may cost an object its data or metadata.

#include <errno.h>

#include <algorithm>

#include "tests/support/stream_builder.h"
#include "tests/tool/case_volume.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

// The text of a file, and not what there is without one.
std::string DataOf(const std::string& path) {
    return Exists(path) ? TextOf(path) : "(there is no " + path + ")";
}

TEST(CaseVolumeTest, ItIsAFileSystemInWhichEverySpellingLeadsToTheSameFile) {
    const CaseVolume volume;
    MAVOEA_SKIP_WITHOUT_CASE_VOLUME(volume);
    const auto path = [&](const std::string& name) { return volume.path() + "/" + name; };
    WriteFile(path("a"), Pattern(300000));
    EXPECT_EQ(Pattern(300000), ReadFile(path("A")));
    EXPECT_EQ(StatusOf(path("a")).st_ino, StatusOf(path("A")).st_ino);
    EXPECT_EQ(0, chmod(path("A").c_str(), 0640));
    EXPECT_EQ(0640, ModeOf(path("a")));
    ASSERT_EQ(0, setxattr(path("a").c_str(), "user.colour", "blue", 4, 0));
    EXPECT_EQ(4, getxattr(path("A").c_str(), "user.colour", nullptr, 0));
    EXPECT_EQ(-1, mkdir(path("A").c_str(), 0755));
    EXPECT_EQ(EEXIST, errno);
    EXPECT_EQ(-1, open(path("A").c_str(), O_WRONLY | O_CREAT | O_EXCL, 0600));
    EXPECT_EQ(EEXIST, errno);

    EXPECT_EQ(0, rename(path("a").c_str(), path("A").c_str()));
    EXPECT_THAT(NamesIn(volume.path()), ElementsAre("a")) << "a rename that does nothing";
    EXPECT_EQ(0, rename(path("a").c_str(), path("b").c_str()));
    EXPECT_FALSE(Exists(path("A")));
    EXPECT_EQ(0, rename(path("b").c_str(), path("A").c_str()));
    EXPECT_THAT(NamesIn(volume.path()), ElementsAre("A"));

    WriteFile(path("b"), Ascii("new"));
    EXPECT_EQ(0, rename(path("B").c_str(), path("a").c_str()));
    EXPECT_THAT(NamesIn(volume.path()), ElementsAre("A")) << "the spelling of what was there";
    EXPECT_EQ("new", TextOf(path("a")));

    ASSERT_EQ(0, mkdir(path("dir").c_str(), 0755));
    WriteFile(path("DIR/File"), {});
    EXPECT_TRUE(Exists(path("Dir/fILE")));
    ASSERT_EQ(0, symlink("DIR/file", path("link").c_str()));
    EXPECT_TRUE(std::filesystem::equivalent(path("LINK"), path("dir/FILE")));
    EXPECT_EQ(0, unlink(path("dir/FILE").c_str()));
    EXPECT_EQ(0, rmdir(path("Dir").c_str()));
    EXPECT_THAT(NamesIn(volume.path()), ElementsAre("A", "link"));
}

// To(...) is on the volume, From(...) where case matters.
class CaseTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_WITHOUT_CASE_VOLUME(volume_);
        travel_.emplace(kEaDirectory, GetParam(), volume_.path());
        ASSERT_FALSE(Exists(From("FROM")));
        ASSERT_TRUE(Exists(volume_.path() + "/TO"));
    }

    const Travel& travel() const { return *travel_; }
    std::string From(const std::string& name) const { return travel_->From(name); }
    std::string To(const std::string& name) const { return travel_->To(name); }
    ToolResult Run(const Arguments& arguments) const { return travel_->Run(arguments); }

    void Make(const std::string& path, const std::string& text) const {
        travel_->MakeFile(path, "data of " + text);
        travel_->GiveMetadata(path, text);
    }
    void ExpectWhole(const std::string& path, const std::string& text) const {
        EXPECT_EQ("data of " + text, DataOf(path));
        travel_->ExpectMetadata(path, text);
    }

    // All that is in the volume, spelled as it is on the disk: the objects, and the files of the
    // metadata that GiveMetadata() makes for those of them that have it.
    void ExpectStored(const std::vector<std::string>& objects,
                      const std::vector<std::string>& with_metadata) {
        std::vector<std::string> beside = objects;
        std::vector<std::string> inside;
        for (const std::string& name : with_metadata) {
            if (GetParam() == kAppleDouble) {
                beside.push_back("._" + name);
            } else {
                inside.insert(inside.end(), {name + "@MavoEAStream", name + "@MavoResource"});
            }
        }
        if (!inside.empty()) beside.push_back("@eaDir");
        EXPECT_THAT(NamesIn(travel_->target()), ::testing::UnorderedElementsAreArray(beside));
        if (inside.empty()) return;
        ASSERT_TRUE(Exists(To("@eaDir")));
        EXPECT_THAT(NamesIn(To("@eaDir")), ::testing::UnorderedElementsAreArray(inside));
    }

    CaseVolume volume_;

 private:
    std::optional<Travel> travel_;
};
INSTANTIATE_TEST_SUITE_P(EveryKind, CaseTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(CaseTest, EverySpellingIsTheSameObjectWithTheSameMetadata) {
    Make(To("a"), "blue");
    ExpectWhole(To("A"), "blue");
    ASSERT_THAT(Run({"set", To("A"), Colour(), "red"}), Succeeded());
    EXPECT_EQ("red", Run({"get", To("a"), Colour()}).out);
    ExpectStored({"a"}, {"a"});
}

// ---- Another spelling ---------------------------------------------------------------------------

TEST_P(CaseTest, AFileTakesAnotherSpellingAndLosesNothing) {
    Make(To("a"), "blue");
    EXPECT_THAT(Run({"mv", To("a"), To("A")}), Succeeded());
    ExpectWhole(To("A"), "blue");
    ExpectWhole(To("a"), "blue");
    ExpectStored({"A"}, {"A"});
}

TEST_P(CaseTest, AFileTakesAnotherSpellingBesideOthersThatStay) {
    Make(To("letter.txt"), "blue");
    Make(To("letter.txt 2"), "red");
    EXPECT_THAT(Run({"mv", "-T", To("letter.txt"), To("Letter.TXT")}), Succeeded());
    ExpectWhole(To("Letter.TXT"), "blue");
    ExpectWhole(To("letter.txt 2"), "red");
    ExpectStored({"Letter.TXT", "letter.txt 2"}, {"Letter.TXT", "letter.txt 2"});
}

TEST_P(CaseTest, AFileWithoutMetadataTakesAnotherSpellingToo) {
    travel().MakeFile(To("a"), "data");
    EXPECT_THAT(Run({"mv", To("a"), To("A")}), Succeeded());
    EXPECT_EQ("data", DataOf(To("a")));
    travel().ExpectNoMetadata(To("A"));
    ExpectStored({"A"}, {});
}

TEST_P(CaseTest, ADirectoryTakesAnotherSpellingAndLosesNothing) {
    for (const Arguments& command : std::vector<Arguments>{{"mv"}, {"mv", "-T"}}) {
        const std::string name = command.size() == 1 ? "dir" : "other";
        const std::string spelled = command.size() == 1 ? "DIR" : "OTHER";
        SCOPED_TRACE(name);
        mkdir(To(name).c_str(), 0755);
        Make(To(name + "/file"), "green");
        travel().GiveMetadata(To(name), "white");
        Arguments arguments = command;
        arguments.insert(arguments.end(), {To(name), To(spelled)});
        EXPECT_THAT(Run(arguments), Succeeded());
        ExpectWhole(To(spelled + "/file"), "green");
        travel().ExpectMetadata(To(spelled), "white");
        travel().ExpectMetadata(To(name), "white");
        ExpectStored({spelled}, {spelled});
        ASSERT_THAT(Run({"rm", "-r", To(spelled)}), Succeeded());
    }
}

TEST_P(CaseTest, TheSameSpellingIsTheSameFileAsEver) {
    Make(To("a"), "blue");
    EXPECT_THAT(Run({"mv", To("a"), To("a")}),
                Failed(1, "'" + To("a") + "' and '" + To("a") +
                              "' are the same file; name another destination"));
    ExpectWhole(To("a"), "blue");
    ExpectStored({"a"}, {"a"});
}

TEST_P(CaseTest, ACopyOntoItselfLosesNothing) {
    Make(To("a"), "blue");
    EXPECT_EQ(1, Run({"cp", To("a"), To("A")}).status);
    ExpectWhole(To("a"), "blue");
    EXPECT_EQ(1, Run({"cp", "-f", To("A"), To("a")}).status);
    ExpectWhole(To("a"), "blue");
    ExpectStored({"a"}, {"a"});
}

TEST_P(CaseTest, WhatOverwritesAnotherSpellingTakesItsPlaceWhole) {
    Make(To("a"), "blue");
    Make(To("b"), "red");
    EXPECT_THAT(Run({"mv", To("b"), To("A")}), Succeeded());
    ExpectWhole(To("a"), "red");
    Make(From("c"), "green");
    EXPECT_THAT(Run({"cp", From("c"), To("A")}), Succeeded());
    ExpectWhole(To("a"), "green");
    travel().MakeFile(From("d"), "plain");
    EXPECT_THAT(Run({"mv", From("d"), To("a")}), Succeeded());
    EXPECT_EQ("plain", DataOf(To("A")));
    travel().ExpectNoMetadata(To("a"));
    EXPECT_EQ(1U, Travel::ObjectsIn(travel().target()).size());
}

TEST_P(CaseTest, WhatIsRemovedUnderAnotherSpellingGoesWithItsMetadata) {
    Make(To("a"), "blue");
    EXPECT_THAT(Run({"rm", To("A")}), Succeeded());
    EXPECT_FALSE(Exists(To("a")));
    ExpectStored({}, {});
    travel().MakeFile(To("a"), "new");
    travel().ExpectNoMetadata(To("a"));
}

TEST_P(CaseTest, MetadataThatIsSpelledLikeNoObjectIsThatOfTheOneItBelongsTo) {
    Make(To("a"), "blue");
    ASSERT_EQ(0, rename(To("a").c_str(), To("b").c_str()));
    ASSERT_EQ(0, rename(To("b").c_str(), To("A").c_str()));
    EXPECT_EQ(0, Run({"clean", "-r", "--yes", "--wait", "0", travel().target()}).status);
    ExpectWhole(To("A"), "blue");
}

// ---- Two objects of which only one has a place --------------------------------------------------

// A tree with two files that differ in spelling only, and another.
class CaseTreeTest : public CaseTest {
 protected:
    void SetUp() override {
        CaseTest::SetUp();
        if (IsSkipped()) return;
        mkdir(From("tree").c_str(), 0755);
        Make(From("tree/a"), "a");
        Make(From("tree/A"), "A");
        Make(From("tree/z"), "z");
    }

    // And two directories that do, each with a file of its own.
    void MakeDirectories() const {
        for (const char* name : {"d", "D"}) {
            mkdir(From(std::string("tree/") + name).c_str(), 0755);
            Make(From(std::string("tree/") + name + "/of " + name), name);
            travel().GiveMetadata(From(std::string("tree/") + name), name);
        }
    }

    void ExpectSource() const {
        for (const std::string name : {"a", "A", "z"}) ExpectWhole(From("tree/" + name), name);
    }

    // The spelling that is in the volume, which is that of the first of the two. That the second is
    // named.
    std::string First(const std::string& one, const std::string& other,
                      const ToolResult& result) const {
        const std::vector<std::string> names = Travel::ObjectsIn(To("tree"));
        const bool one_is_first = std::count(names.begin(), names.end(), one) == 1;
        EXPECT_EQ(one_is_first ? 0 : 1, std::count(names.begin(), names.end(), other));
        const std::string& second = one_is_first ? other : one;
        EXPECT_THAT(result.err, AnyOf(HasSubstr("mavoea: " + From("tree/" + second) + ": "),
                                      HasSubstr("mavoea: " + To("tree/" + second) + ": ")));
        return one_is_first ? one : other;
    }

    // That the first of the two files is in the volume, whole, and the second is named.
    void ExpectFirst(const ToolResult& result, int status = 1) const {
        EXPECT_EQ(status, result.status);
        const std::string first = First("a", "A", result);
        ExpectWhole(To("tree/" + first), first);
        ExpectWhole(To("tree/z"), "z");
    }
};
INSTANTIATE_TEST_SUITE_P(EveryKind, CaseTreeTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(CaseTreeTest, TheSecondOfTwoIsNamedAndTheFirstStaysWhole) {
    ExpectFirst(Run({"cp", "-r", From("tree"), travel().target()}));
    ExpectSource();
}

TEST_P(CaseTreeTest, TwoThatAreNamedOneByOneAreAlikeInThat) {
    mkdir(To("tree").c_str(), 0755);
    const ToolResult result =
        Run({"cp", From("tree/a"), From("tree/A"), From("tree/z"), To("tree")});
    ExpectFirst(result);
    EXPECT_THAT(Travel::ObjectsIn(To("tree")), ElementsAre("a", "z"));
    ExpectSource();
}

TEST_P(CaseTreeTest, MovedTheyKeepTheirSource) {
    ExpectFirst(Run({"mv", From("tree"), travel().target()}));
    ExpectSource();
}

TEST_P(CaseTreeTest, OfTwoDirectoriesTheSecondIsNamedAndTheFirstStaysWhole) {
    MakeDirectories();
    const ToolResult result = Run({"cp", "-r", From("tree"), travel().target()});
    ExpectFirst(result);
    const std::string first = First("d", "D", result);
    EXPECT_THAT(Travel::ObjectsIn(To("tree/" + first)), ElementsAre("of " + first));
    ExpectWhole(To("tree/" + first + "/of " + first), first);
    travel().ExpectMetadata(To("tree/" + first), first);
}

TEST_P(CaseTreeTest, ConvertedTheSecondIsNamedToo) {
    const ToolResult result =
        Run({"convert", "-r", "--to", std::to_string(GetParam()), From("tree"), To("tree")});
    ExpectFirst(result, 2);
    ExpectSource();
}

}  // namespace
}  // namespace mavoea::test

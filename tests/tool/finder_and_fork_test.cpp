// Finder info and resource fork through the tool, on volumes that keep them in files beside the
// object, alone and together with named attributes.

#include <gtest/gtest.h>
#include <unistd.h>

#include <memory>

#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";

// "TEXTttxt" and 24 bytes that all differ.
Bytes SomeFinderInfo() { return Ascii("TEXTttxt") + Pattern(24, 1); }

class FinderAndForkTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        if (GetParam() != 0) MAVOEA_SKIP_UNLESS_ROOT();
        volume_ = std::make_unique<Volume>(GetParam());
    }

    bool IsAppleDouble() const { return GetParam() == 0; }

    // All that the volume's files hold is found, and the layouts of its files are sound.
    void ExpectSound(const std::string& path) const {
        const ToolResult dump = RunTool({"dump", path});
        EXPECT_EQ(0, dump.status) << dump.out;
    }

    std::unique_ptr<Volume> volume_;
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, FinderAndForkTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(FinderAndForkTest, AForkComesBackAsItWas) {
    const Bytes values[] = {Pattern(1), Pattern(5000, 1), Pattern(70000, 2), Hex("00"),
                            Pattern(300, 3)};
    for (const Bytes& value : values) {
        ASSERT_THAT(volume_->Set(kFork, value), Succeeded());
        const ToolResult got = volume_->Get(kFork);
        EXPECT_THAT(got, Succeeded());
        EXPECT_EQ(value, got.bytes());
        EXPECT_EQ(82 + value.size(), ReadFile(volume_->finder_file()).size());
    }
    EXPECT_EQ(kFork + "\n", volume_->List().out);
    EXPECT_THAT(volume_->Remove(kFork), Succeeded());
    EXPECT_EQ("", volume_->List().out);
    EXPECT_EQ(82U, ReadFile(volume_->finder_file()).size());
}

TEST_P(FinderAndForkTest, FinderInfoComesBackAsItWas) {
    ASSERT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()), Succeeded());
    EXPECT_EQ(SomeFinderInfo(), volume_->Get(kFinderInfo).bytes());
    EXPECT_EQ(kFinderInfo + "\n", volume_->List().out);
    EXPECT_THAT(volume_->Remove(kFinderInfo), Succeeded());
    EXPECT_EQ(1, volume_->Get(kFinderInfo).status);
    EXPECT_EQ("", volume_->List().out);
    EXPECT_EQ(1, volume_->Remove(kFinderInfo).status);
}

TEST_P(FinderAndForkTest, ANewFileIsAPlainOneOfTwoEntries) {
    ASSERT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()), Succeeded());
    ASSERT_THAT(volume_->Set(kFork, Ascii("fork")), Succeeded());
    EXPECT_EQ(Hex("00051607 00020000 'Mac OS X        ' 0002"
                  "00000009 00000032 00000020"
                  "00000002 00000052 00000004") +
                  SomeFinderInfo() + Ascii("fork"),
              ReadFile(volume_->finder_file()));
}

TEST_P(FinderAndForkTest, FinderInfoOfAnotherSizeIsRefusedAndMakesNoFile) {
    for (const std::size_t size : {0U, 31U, 33U, 64U}) {
        EXPECT_THAT(volume_->Set(kFinderInfo, Pattern(size)),
                    Failed(2, volume_->object() + ": Finder info has 32 bytes, the value has " +
                                  std::to_string(size) +
                                  "; give all of them, as with --hex and 64 digits"));
    }
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume_->path()));
}

TEST_P(FinderAndForkTest, NothingAtAllMeansNoneAndMakesNoFile) {
    EXPECT_THAT(volume_->Set(kFinderInfo, Bytes(32)), Succeeded());
    EXPECT_THAT(volume_->Set(kFork, {}), Succeeded());
    EXPECT_EQ(1, volume_->Get(kFinderInfo).status);
    EXPECT_EQ(1, volume_->Get(kFork).status);
    EXPECT_EQ(1, volume_->Remove(kFinderInfo).status);
    EXPECT_EQ(1, volume_->Remove(kFork).status);
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume_->path()));

    ASSERT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()), Succeeded());
    ASSERT_THAT(volume_->Set(kFork, Ascii("fork")), Succeeded());
    EXPECT_THAT(volume_->Set(kFinderInfo, Bytes(32)), Succeeded());
    EXPECT_THAT(volume_->Set(kFork, {}), Succeeded());
    EXPECT_EQ("", volume_->List().out);
}

TEST_P(FinderAndForkTest, AttributesForkAndFinderInfoLeaveEachOtherAlone) {
    const Bytes fork = Pattern(5000, 1);
    ASSERT_THAT(volume_->Set(kFork, fork), Succeeded());
    ASSERT_THAT(volume_->Set("first", Pattern(300, 2)), Succeeded());
    EXPECT_EQ(fork, volume_->Get(kFork).bytes());
    ASSERT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()), Succeeded());
    ASSERT_THAT(volume_->Set("second", {}), Succeeded());
    ExpectSound(volume_->attribute_file());
    EXPECT_EQ(fork, volume_->Get(kFork).bytes());
    EXPECT_EQ(SomeFinderInfo(), volume_->Get(kFinderInfo).bytes());

    const Bytes shorter = Pattern(100, 3);
    ASSERT_THAT(volume_->Set(kFork, shorter), Succeeded());
    EXPECT_EQ(Pattern(300, 2), volume_->Get("first").bytes());
    EXPECT_EQ("first\nsecond\n" + kFinderInfo + "\n" + kFork + "\n", volume_->List().out);
    ASSERT_THAT(volume_->Set("first", Pattern(3, 4)), Succeeded());
    EXPECT_EQ(shorter, volume_->Get(kFork).bytes());
    ASSERT_THAT(volume_->Remove("second"), Succeeded());
    EXPECT_EQ(shorter, volume_->Get(kFork).bytes());
    ExpectSound(volume_->attribute_file());

    ASSERT_THAT(volume_->Remove(kFork), Succeeded());
    EXPECT_EQ(Pattern(3, 4), volume_->Get("first").bytes());
    EXPECT_EQ(SomeFinderInfo(), volume_->Get(kFinderInfo).bytes());
    ASSERT_THAT(volume_->Remove(kFinderInfo), Succeeded());
    EXPECT_EQ("first\n", volume_->List().out);
    ExpectSound(volume_->attribute_file());
}

TEST_P(FinderAndForkTest, ALongListSaysWhatTheyAre) {
    ASSERT_THAT(volume_->Set("a", Ascii("123")), Succeeded());
    ASSERT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()), Succeeded());
    ASSERT_THAT(volume_->Set(kFork, Pattern(4321)), Succeeded());
    EXPECT_EQ(
        "         3  attribute      a                       " + volume_->attribute_file() +
            "\n        32  Finder info    com.apple.FinderInfo    " + volume_->finder_info_file() +
            "\n      4321  resource fork  com.apple.ResourceFork  " + volume_->finder_file() + "\n",
        volume_->Run({"list", "-l", volume_->object()}).out);
    const auto json = volume_->Run({"list", "--json", volume_->object()}).json();
    EXPECT_EQ("Finder info", json["attributes"][1]["kind"]);
    EXPECT_EQ("resource fork", json["attributes"][2]["kind"]);
    EXPECT_EQ(4321, json["attributes"][2]["size"]);
}

// ---- Files that others wrote --------------------------------------------------------------------

TEST_P(FinderAndForkTest, OnlyTheForkAndItsLengthChangeInAStream) {
    StreamImage image{.attributes = {{"a", Ascii("one"), 0x1234}, {"b", Pattern(50)}},
                      .fork = Pattern(500),
                      .finder_info = SomeFinderInfo(),
                      .debug_tag = 0xCAFE,
                      .slack = 20};
    ASSERT_THAT(volume_->Set(kFork, Ascii("make the directory")), Succeeded());
    WriteFile(volume_->finder_file(), image.Build());
    ASSERT_THAT(volume_->Set(kFork, Pattern(700, 1)), Succeeded());
    image.fork = Pattern(700, 1);
    EXPECT_EQ(image.Build(), ReadFile(volume_->finder_file()));
    ASSERT_THAT(volume_->Set(kFinderInfo, Pattern(32, 5)), Succeeded());
    image.finder_info = Pattern(32, 5);
    EXPECT_EQ(image.Build(), ReadFile(volume_->finder_file()));
    ASSERT_THAT(volume_->Remove(kFork), Succeeded());
    image.fork.clear();
    EXPECT_EQ(image.Build(), ReadFile(volume_->finder_file()));
}

TEST_P(FinderAndForkTest, OtherEntriesStayWhereTheyAre) {
    // Finder info at 98 and a comment at 130 before the fork at 137.
    const Bytes head =
        Hex("00051607 00020000 00*16 0003"
            "00000004 00000082 00000007"
            "00000009 00000062 00000020");
    const auto file = [&](const Bytes& finder_info, const Bytes& fork) {
        Bytes length(4);
        PutU32(length, 0, fork.size());
        return head + Hex("00000002 00000089") + length + Bytes(36) + finder_info +
               Ascii("comment") + fork;
    };
    ASSERT_THAT(volume_->Set(kFork, Ascii("make the directory")), Succeeded());
    WriteFile(volume_->finder_file(), file(SomeFinderInfo(), Pattern(40)));
    EXPECT_EQ(SomeFinderInfo(), volume_->Get(kFinderInfo).bytes());
    EXPECT_EQ(Pattern(40), volume_->Get(kFork).bytes());
    ASSERT_THAT(volume_->Set(kFork, Pattern(10, 1)), Succeeded());
    EXPECT_EQ(file(SomeFinderInfo(), Pattern(10, 1)), ReadFile(volume_->finder_file()));
    ASSERT_THAT(volume_->Set(kFinderInfo, Pattern(32, 7)), Succeeded());
    EXPECT_EQ(file(Pattern(32, 7), Pattern(10, 1)), ReadFile(volume_->finder_file()));
    ASSERT_THAT(volume_->Remove(kFork), Succeeded());
    EXPECT_EQ(file(Pattern(32, 7), {}), ReadFile(volume_->finder_file()));
}

TEST_P(FinderAndForkTest, AForkThatIsNotTheLastPartIsNotChanged) {
    ASSERT_THAT(volume_->Set(kFork, Ascii("make the directory")), Succeeded());
    const std::string path = volume_->finder_file();
    // The fork at 50, the Finder info behind it at 54.
    const Bytes file = Hex("00051607 00020000 00*16 0002"
                           "00000002 00000032 00000004"
                           "00000009 00000036 00000020 'fork'") +
                       SomeFinderInfo();
    WriteFile(path, file);
    EXPECT_EQ("fork", volume_->Get(kFork).out);
    const std::string message =
        path + ": its resource fork is not its last part; look at it with: mavoea dump FILE";
    EXPECT_THAT(volume_->Set(kFork, Ascii("xy")), Failed(2, message));
    EXPECT_THAT(volume_->Remove(kFork), Failed(2, message));
    EXPECT_EQ(file, ReadFile(path));
    EXPECT_THAT(volume_->Set(kFinderInfo, Pattern(32, 3)), Succeeded());
    EXPECT_EQ(Bytes(file.begin(), file.end() - 32) + Pattern(32, 3), ReadFile(path));
}

TEST_P(FinderAndForkTest, AFileWithoutTheEntryIsNotChanged) {
    ASSERT_THAT(volume_->Set(kFork, Ascii("make the directory")), Succeeded());
    const std::string path = volume_->finder_file();
    const Bytes file = Hex("00051607 00020000 00*16 0001 00000003 00000026 00000004 'name'");
    WriteFile(path, file);
    EXPECT_EQ(1, volume_->Get(kFork).status);
    EXPECT_EQ(1, volume_->Get(kFinderInfo).status);
    EXPECT_THAT(volume_->Set(kFork, Ascii("x")),
                Failed(2, path + ": it has no entry for a resource fork; look at it with: mavoea "
                                 "dump FILE"));
    EXPECT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()),
                Failed(2, path + ": it has no entry for a Finder info; look at it with: mavoea "
                                 "dump FILE"));
    EXPECT_EQ(file, ReadFile(path));
}

TEST_P(FinderAndForkTest, FinderInfoIsNeverWrittenOverTheHeader) {
    ASSERT_THAT(volume_->Set(kFork, Ascii("fork")), Succeeded());
    const std::string path = volume_->finder_file();
    Bytes file = ReadFile(path);
    for (const std::uint32_t offset : {0U, 20U, 49U, 60U, 0xFFFFFFFFU}) {
        PutU32(file, kFinderOffsetAt, offset);
        WriteFile(path, file);
        EXPECT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()),
                    Failed(2, path + ": it has no room for Finder info where its header says; "
                                     "look at it with: mavoea dump FILE"));
        EXPECT_EQ(file, ReadFile(path));
    }
}

TEST_P(FinderAndForkTest, AForkThatPassesTheEndOfTheFileIsToldSo) {
    ASSERT_THAT(volume_->Set(kFork, Ascii("fork")), Succeeded());
    Bytes file = ReadFile(volume_->finder_file());
    PutU32(file, kForkLengthAt, 0xFFFFFFFF);
    WriteFile(volume_->finder_file(), file);
    EXPECT_THAT(volume_->Get(kFork),
                Failed(2, volume_->finder_file() +
                              ": damaged: its resource fork passes the end of the file; look at "
                              "it with: mavoea dump FILE"));
    ASSERT_THAT(volume_->Set(kFork, Ascii("mended")), Succeeded());
    EXPECT_EQ("mended", volume_->Get(kFork).out);
}

TEST_P(FinderAndForkTest, AnEmptyFileIsAFreshOne) {
    ASSERT_THAT(volume_->Set(kFork, Ascii("make the directory")), Succeeded());
    WriteFile(volume_->finder_file(), {});
    EXPECT_EQ("", volume_->List().out);
    ASSERT_THAT(volume_->Set(kFinderInfo, SomeFinderInfo()), Succeeded());
    EXPECT_EQ(82U, ReadFile(volume_->finder_file()).size());
}

// ---- Two places on EA-directory volumes ---------------------------------------------------------

class EaDirectoryTest : public FinderAndForkTest {};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, EaDirectoryTest, ::testing::Values(1, 2),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(EaDirectoryTest, WhatOnlyTheStreamHasIsShownUntilTheResourceFileHasSome) {
    ASSERT_THAT(volume_->Set("a", Ascii("1")), Succeeded());
    const StreamImage image{.attributes = {{"a", Ascii("1")}},
                            .fork = Ascii("of the stream"),
                            .finder_info = SomeFinderInfo()};
    WriteFile(volume_->stream(), image.Build());
    EXPECT_EQ("of the stream", volume_->Get(kFork).out);
    EXPECT_EQ(SomeFinderInfo(), volume_->Get(kFinderInfo).bytes());
    EXPECT_EQ("         1  attribute      a                       " + volume_->stream() +
                  "\n        32  Finder info    com.apple.FinderInfo    " + volume_->stream() +
                  "\n        13  resource fork  com.apple.ResourceFork  " + volume_->stream() +
                  "\n",
              volume_->Run({"list", "-l", volume_->object()}).out);

    ASSERT_THAT(volume_->Set(kFork, Ascii("of the resource file")), Succeeded());
    EXPECT_EQ("of the resource file", volume_->Get(kFork).out);
    EXPECT_EQ(SomeFinderInfo(), volume_->Get(kFinderInfo).bytes()) << "still the stream's";
    EXPECT_EQ(image.Build(), ReadFile(volume_->stream()));
}

TEST_P(EaDirectoryTest, RemovingClearsBothPlaces) {
    ASSERT_THAT(volume_->Set(kFork, Ascii("of the resource file")), Succeeded());
    ASSERT_THAT(volume_->Set(kFinderInfo, Pattern(32, 1)), Succeeded());
    StreamImage image{.attributes = {{"a", Ascii("1")}},
                      .fork = Ascii("of the stream"),
                      .finder_info = SomeFinderInfo()};
    WriteFile(volume_->stream(), image.Build());
    EXPECT_THAT(volume_->Remove(kFork), Succeeded());
    EXPECT_THAT(volume_->Remove(kFinderInfo), Succeeded());
    EXPECT_EQ("a\n", volume_->List().out);
    image.fork.clear();
    image.finder_info = Bytes(32);
    EXPECT_EQ(image.Build(), ReadFile(volume_->stream()));
}

TEST_P(EaDirectoryTest, ANetatalkRecordInTheResourceFileKeepsItsOtherEntries) {
    ASSERT_THAT(volume_->Set(kFork, Ascii("make the directory")), Succeeded());
    // 13 entries: Finder info at 182, fork at 214, then ids that no one else has, all of them
    // empty.
    const Bytes file = PlainAppleDouble(SomeFinderInfo(), Pattern(30), 13);
    WriteFile(volume_->resource(), file);
    EXPECT_EQ(SomeFinderInfo(), volume_->Get(kFinderInfo).bytes());
    EXPECT_EQ(Pattern(30), volume_->Get(kFork).bytes());
    ASSERT_THAT(volume_->Set(kFinderInfo, Pattern(32, 9)), Succeeded());
    EXPECT_EQ(PlainAppleDouble(Pattern(32, 9), Pattern(30), 13), ReadFile(volume_->resource()));
}

}  // namespace
}  // namespace mavoea::test

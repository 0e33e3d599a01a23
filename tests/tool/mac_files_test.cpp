// AppleDouble files that Macs and other programs wrote, where they are at hand.

#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

class MacFilesTest : public ::testing::Test {
 protected:
    void SetUp() override {
        if (!Exists(MAVOEA_SHARED_DATA)) {
            GTEST_SKIP() << "there are no sample files at ../shared/data from the project's root";
        }
    }

    static Bytes Sample(const std::string& name) {
        return ReadFile(std::string(MAVOEA_SHARED_DATA) + "/" + name);
    }

    // Puts the sample beside the object of an AppleDouble volume.
    void Place(const std::string& name) const { WriteFile(volume_.apple_double(), Sample(name)); }

    ToolResult Dump() const { return RunTool({"dump", volume_.apple_double()}); }

    Volume volume_{0};
};

TEST_F(MacFilesTest, FilesThatMacsWroteAreSound) {
    for (const auto& entry : std::filesystem::recursive_directory_iterator(MAVOEA_SHARED_DATA)) {
        if (!entry.is_regular_file() || entry.path().extension() != ".bin") continue;
        SCOPED_TRACE(entry.path().string());
        const Bytes bytes = ReadFile(entry.path().string());
        const bool is_apple_double = bytes.size() > 26 && U32At(bytes, 0) == 0x00051607;
        const ToolResult dump = RunTool({"dump", entry.path().string()});
        EXPECT_EQ(is_apple_double ? 0 : 2, dump.status) << dump.out;
        WriteFile(volume_.apple_double(), bytes);
        EXPECT_EQ(is_apple_double ? 0 : 2, volume_.List().status);
        EXPECT_EQ(bytes, ReadFile(volume_.apple_double()));
    }
}

TEST_F(MacFilesTest, AnAccessListIsAnAttribute) {
    Place("libarchive/appledouble_cpio__dot_file3.bin");
    EXPECT_EQ("com.apple.acl.text\n", volume_.List().out);
    const Bytes file = Sample("libarchive/appledouble_cpio__dot_file3.bin");
    EXPECT_EQ(Bytes(file.begin() + 152, file.end()), volume_.Get("com.apple.acl.text").bytes());
}

TEST_F(MacFilesTest, AQuarantineMarkIsAnAttribute) {
    Place("libarchive/appledouble_zip__dot_apple_double_dir_test.bin");
    EXPECT_EQ("com.apple.quarantine\n", volume_.List().out);
    EXPECT_EQ(Hex("'q/0083;00000000;;' 00"), volume_.Get("com.apple.quarantine").bytes());
}

TEST_F(MacFilesTest, AnAttributeAreaOfNoAttributesStandsBeforeAFork) {
    Place("libarchive/appledouble_zip__dot_test_file.bin");
    EXPECT_EQ("com.apple.ResourceFork\n", volume_.List().out);
    EXPECT_EQ("resource fork\n", volume_.Get("com.apple.ResourceFork").out);
}

TEST_F(MacFilesTest, AnEmptyAttributeWithOffsetZeroIsEmptyAndSurvivesChanges) {
    Place("libarchive/compat_mac-2__dot_myfile.bin");
    EXPECT_EQ(
        "com.opcoders.a_first\ncom.opcoders.b_second\ncom.opcoders.c_empty\ncom.opcoders.d_last\n",
        volume_.List().out);
    EXPECT_THAT(Dump().out, HasSubstr("  2  offset 0  length 0  flags 0x0000"));
    ASSERT_THAT(volume_.Set("new", Ascii("value")), Succeeded());
    ASSERT_THAT(volume_.Set("com.apple.ResourceFork", Ascii("fork")), Succeeded());
    ASSERT_THAT(volume_.Remove("com.opcoders.b_second"), Succeeded());
    EXPECT_EQ(0, Dump().status);
    EXPECT_EQ("first", volume_.Get("com.opcoders.a_first").out);
    EXPECT_THAT(volume_.Get("com.opcoders.c_empty"), Succeeded());
    EXPECT_EQ("", volume_.Get("com.opcoders.c_empty").out);
    EXPECT_EQ("last", volume_.Get("com.opcoders.d_last").out);
    EXPECT_EQ("value", volume_.Get("new").out);
    EXPECT_EQ("fork", volume_.Get("com.apple.ResourceFork").out);
}

TEST_F(MacFilesTest, LargeForksBehindUnusedSpaceAreReadAndKept) {
    const struct {
        const char* name;
        std::size_t fork_size;
    } samples[] = {{"ciderpress2/dot_GSHK.bin", 18063}, {"ciderpress2/dot_gshk.docs.bin", 575}};
    for (const auto& [name, fork_size] : samples) {
        SCOPED_TRACE(name);
        Place(name);
        const Bytes file = Sample(name);
        const Bytes fork(file.end() - static_cast<std::ptrdiff_t>(fork_size), file.end());
        EXPECT_EQ("com.apple.FinderInfo\ncom.apple.ResourceFork\n", volume_.List().out);
        EXPECT_EQ(fork, volume_.Get("com.apple.ResourceFork").bytes());
        ASSERT_THAT(volume_.Set("a", Pattern(100)), Succeeded());
        EXPECT_EQ(fork, volume_.Get("com.apple.ResourceFork").bytes());
        EXPECT_EQ(Pattern(100), volume_.Get("a").bytes());
        EXPECT_EQ(Bytes(file.begin() + 50, file.begin() + 82),
                  volume_.Get("com.apple.FinderInfo").bytes());
        EXPECT_EQ(0, Dump().status);
    }
}

TEST_F(MacFilesTest, FinderInfoElsewhereThanAt50IsFoundThroughItsDescriptor) {
    Place("ciderpress2/dot_Installer_Disk_1.image.bin");
    EXPECT_EQ("com.apple.FinderInfo\ncom.apple.ResourceFork\n", volume_.List().out);
    EXPECT_EQ(Hex("'dImgdCpy' 80 00*23").size(), volume_.Get("com.apple.FinderInfo").out.size());
    EXPECT_EQ(359U, volume_.Get("com.apple.ResourceFork").out.size());
    const Bytes before = Sample("ciderpress2/dot_Installer_Disk_1.image.bin");
    ASSERT_THAT(volume_.Set("com.apple.ResourceFork", Ascii("new")), Succeeded());
    Bytes expected(before.begin(), before.begin() + 0xB0);
    PutU32(expected, 26 + 5 * 12 + 8, 3);  // the sixth entry's length
    EXPECT_EQ(expected + Ascii("new"), ReadFile(volume_.apple_double()));

    Place("ciderpress2/percent_alt-ext1.bin");
    EXPECT_EQ(std::string("com.apple.FinderInfo\n"), volume_.List().out);
    EXPECT_THAT(volume_.Get("com.apple.FinderInfo").out, ::testing::StartsWith("ABCDEFGH"));
    EXPECT_EQ(2, volume_.Set("com.apple.ResourceFork", Ascii("no entry for it")).status);
    EXPECT_EQ(Sample("ciderpress2/percent_alt-ext1.bin"), ReadFile(volume_.apple_double()));
}

TEST_F(MacFilesTest, WhatOnlyLooksLikeAppleDoubleIsToldSo) {
    for (const char* name :
         {"ciderpress2/dot_not_adf.bin", "ciderpress2/applesingle_hello__.as.bin",
          "ciderpress2/applesingle_badmac-utf8name.as.bin"}) {
        SCOPED_TRACE(name);
        Place(name);
        EXPECT_THAT(volume_.List(),
                    Failed(2, volume_.apple_double() +
                                  ": no AppleDouble file; move it away, or look at it with: mavoea "
                                  "dump FILE"));
        EXPECT_THAT(Dump().out, HasSubstr("no AppleDouble file"));
        EXPECT_EQ(Sample(name), ReadFile(volume_.apple_double()));
    }
}

}  // namespace
}  // namespace mavoea::test

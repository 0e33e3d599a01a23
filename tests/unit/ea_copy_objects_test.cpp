// Copies of objects of every sort of name, files and directories, by the external commands and in
// process.

#include <sys/stat.h>
#include <sys/xattr.h>

#include <filesystem>
#include <string>
#include <tuple>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

constexpr int kAppleDouble = 0;
constexpr int kEADir = 1;
constexpr int kFileEA = 2;

const Bytes kFinderInfo = Pattern(32, 0x30);
const Bytes kFork = Pattern(700, 0x50);

std::vector<std::string> Names() {
    std::vector<std::string> names = OddNames();
    names.push_back("Icon\r");
    names.push_back(std::string(242, 'l'));
    names.push_back("\xC3\xA9" + std::string(230, 'm'));
    return names;
}

int CopyInProcess(const char* from, const char* to) {
    std::error_code error;
    std::filesystem::copy_file(from, to, std::filesystem::copy_options::overwrite_existing, error);
    return error ? -1 : 0;
}

struct Way {
    int from;
    int to;
};

// Way, whether it is a move, whether the caller copies files itself, whether it is a directory.
class CopyObjectsTest : public ::testing::TestWithParam<std::tuple<Way, bool, bool, bool>> {
 protected:
    void SetUp() override {
        if (geteuid() != 0) GTEST_SKIP() << "making EA directories takes the superuser";
        ResetKernel();
        ResetPlatform();
        std::filesystem::create_directory(dir_ / "src");
        std::filesystem::create_directory(dir_ / "dst");
    }
    void TearDown() override {
        ResetKernel();
        ResetPlatform();
    }

    Way way() const { return std::get<0>(GetParam()); }
    bool moves() const { return std::get<1>(GetParam()); }
    bool in_process() const { return std::get<2>(GetParam()); }
    bool is_directory() const { return std::get<3>(GetParam()); }

    ObjectFiles At(const std::string& end, const std::string& name) const {
        return {.parent = dir_ / end, .name = name};
    }

    void MakeObject(const ObjectFiles& object) const {
        if (is_directory()) {
            std::filesystem::create_directory(object.object());
        } else {
            object.MakeObject();
        }
    }

    static StreamImage Stream() {
        StreamImage image;
        image.attributes = {{.name = "user.color", .value = Ascii("blue")},
                            {.name = "empty", .value = {}}};
        return image;
    }

    void MakeSource(const ObjectFiles& object) const {
        MakeObject(object);
        if (way().from == kAppleDouble) {
            WriteFile(object.sidecar(), Sidecar().bytes);
            return;
        }
        std::filesystem::create_directory(object.ea_dir());
        WriteFile(object.resource(), ClassicFile(kFinderInfo, kFork).bytes);
        WriteFile(object.stream(), Stream().Build());
        if (way().from == kFileEA) {
            // The record's Finder info is the newer one.
            const Bytes record = Record();
            ASSERT_EQ(0, setxattr(object.object().c_str(), "user.netatalk.Metadata", record.data(),
                                  record.size(), 0));
        }
    }

    static MacFile Sidecar() {
        return MacSidecar({.attributes = {{"user.color", Ascii("blue")}, {"empty", {}}},
                           .finder_info = kFinderInfo,
                           .fork = kFork});
    }

    static Bytes Record() {
        return Hex("00 05 16 07 00 02 00 00 00*16 00 08"
                   "00 00 00 04 00 00 00 9A 00 00 00 00  00 00 00 08 00 00 01 62 00 00 00 10"
                   "00 00 00 09 00 00 00 7A 00 00 00 20  00 00 00 0E 00 00 01 72 00 00 00 04"
                   "80 44 45 56 00 00 01 76 00 00 00 00  80 49 4E 4F 00 00 01 7E 00 00 00 00"
                   "80 53 59 4E 00 00 01 86 00 00 00 00  80 53 56 7E 00 00 01 8E 00 00 00 00") +
               kFinderInfo + Repeat(0, 402 - 154);
    }

    static void ExpectMacFile(const std::string& path, const MacContents& expected) {
        const auto found = ReadMacFile(ReadFile(path));
        ASSERT_TRUE(found.has_value()) << path;
        EXPECT_EQ(expected.finder_info, found->finder_info) << path;
        EXPECT_EQ(expected.fork, found->fork) << path;
        EXPECT_EQ(expected.attributes, found->attributes) << path;
    }

    void ExpectCopy(const ObjectFiles& object) const {
        const MacContents all = Sidecar().contents;
        if (way().to == kAppleDouble) {
            ExpectMacFile(object.sidecar(), all);
            return;
        }
        ExpectMacFile(object.resource(), {.finder_info = kFinderInfo, .fork = kFork});
        const auto stream = ReadMacFile(ReadFile(object.stream()));
        ASSERT_TRUE(stream.has_value());
        EXPECT_EQ(all.attributes, stream->attributes);
        if (way().to != kFileEA) return;
        Bytes record(1024);
        const ssize_t size = getxattr(object.object().c_str(), "user.netatalk.Metadata",
                                      record.data(), record.size());
        record.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
        EXPECT_EQ(Record(), record);
    }

    TempDir dir_;
};

TEST_P(CopyObjectsTest, ObjectsOfEveryNameHaveTheirMetadataAtTheOtherEnd) {
    for (const std::string& name : Names()) {
        SCOPED_TRACE(name);
        const ObjectFiles from = At("src", name);
        const ObjectFiles to = At("dst", name);
        MakeSource(from);
        MakeObject(to);
        const auto before = Tree(dir_ / "src");
        std::string target = to.object();
        EXPECT_EQ(0,
                  MAVOEACopyEx(from.object().c_str(), target.data(), moves() ? 1 : 0, 0, way().from,
                               way().to, 0, 0, in_process() ? CopyInProcess : nullptr));
        ExpectCopy(to);
        if (moves()) {
            // From here the emptied EA directory is nobody's to remove.
            const bool stays = way().from == kFileEA && way().to == kAppleDouble;
            EXPECT_EQ(stays, Exists(from.ea_dir()));
            if (stays) {
                EXPECT_THAT(NamesIn(from.ea_dir()), ::testing::IsEmpty());
            }
            EXPECT_FALSE(Exists(from.sidecar()));
            EXPECT_TRUE(Exists(from.object()));
        } else {
            EXPECT_EQ(before, Tree(dir_ / "src"));
        }
        for (const char* end : {"src", "dst"}) {
            std::filesystem::remove_all(dir_ / end);
            std::filesystem::create_directory(dir_ / end);
        }
    }
}

std::string NameOf(const ::testing::TestParamInfo<CopyObjectsTest::ParamType>& info) {
    const auto& [way, moves, in_process, is_directory] = info.param;
    return std::to_string(way.from) + "To" + std::to_string(way.to) + (moves ? "Move" : "Copy") +
           (in_process ? "InProcess" : "ByCommand") + (is_directory ? "Directory" : "File");
}

INSTANTIATE_TEST_SUITE_P(
    EveryWay, CopyObjectsTest,
    ::testing::Combine(::testing::Values(Way{kAppleDouble, kAppleDouble}, Way{kAppleDouble, kEADir},
                                         Way{kAppleDouble, kFileEA}, Way{kEADir, kAppleDouble},
                                         Way{kEADir, kEADir}, Way{kEADir, kFileEA},
                                         Way{kFileEA, kAppleDouble}, Way{kFileEA, kEADir},
                                         Way{kFileEA, kFileEA}),
                       ::testing::Bool(), ::testing::Bool(), ::testing::Bool()),
    NameOf);

}  // namespace
}  // namespace mavoea::test

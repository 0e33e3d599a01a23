// What a copy wrote is read back, and what it read may have changed meanwhile: mv removes nothing
// that is not at the destination as it is at the source. The tool stands still while a byte of what
// it has just written changes, as on a disk that cannot be relied on, or the source does.

#include <gtest/gtest.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "tests/tool/stopped_tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

const std::string kFork = "com.apple.ResourceFork";
const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kBlue = "blue as it was";

std::optional<std::size_t> Find(const Bytes& bytes, const Bytes& wanted) {
    const auto at = std::search(bytes.begin(), bytes.end(), wanted.begin(), wanted.end());
    if (at == bytes.end()) return std::nullopt;
    return static_cast<std::size_t>(at - bytes.begin());
}

// Nothing where it has gone meanwhile: files under way may have names for a moment only.
Bytes AttributeOf(const std::string& path, const std::string& name) {
    Bytes value(4096);
    const ssize_t size = getxattr(path.c_str(), name.c_str(), value.data(), value.size());
    value.resize(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
    return value;
}

std::vector<std::string> FilesIn(const std::string& tree) {
    std::vector<std::string> files;
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(tree)) {
        if (!entry.is_symlink() && entry.is_regular_file()) files.push_back(entry.path().string());
    }
    return files;
}

// With those that the tool has made there, and that have no name yet.
std::vector<std::string> FilesIn(const std::string& tree, const FileCall& call) {
    std::vector<std::string> files = FilesIn(tree);
    for (const std::string& file : call.FilesWithoutNames(tree)) files.push_back(file);
    return files;
}

// Changes the last byte of `wanted` where one of the files, or an attribute of one, holds all of
// it. False when none does.
bool Spoil(const std::vector<std::string>& files, const Bytes& wanted) {
    for (const std::string& path : files) {
        if (const auto at = Find(ReadFile(path), wanted)) {
            const std::size_t last = *at + wanted.size() - 1;
            const auto other = static_cast<std::uint8_t>(wanted.back() ^ 1);
            const int fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);
            EXPECT_EQ(1, pwrite(fd, &other, 1, static_cast<off_t>(last))) << path;
            close(fd);
            return true;
        }
        Bytes value = AttributeOf(path, Colour());
        if (value == wanted) {
            value.back() ^= 1;
            EXPECT_EQ(0, setxattr(path.c_str(), Colour().c_str(), value.data(), value.size(), 0));
            return true;
        }
    }
    return false;
}

// ---- What was written ---------------------------------------------------------------------------

struct Way {
    int from;
    int to;
    std::string item;  // its name; empty: the data
    bool two_volumes = false;
};
void PrintTo(const Way& way, std::ostream* out) {
    *out << way.from << "to" << way.to << (way.item.empty() ? "data" : way.item);
}

std::vector<Way> AllWays() {
    std::vector<Way> ways;
    const std::vector<int> types = Types({0, 1, 2, 7});
    for (const int from : types) {
        for (const int to : types) {
            for (const std::string& item : {std::string(), Colour(), kFork, kFinderInfo}) {
                const bool kept = KeepsFork(from) && KeepsFork(to);
                if ((item == kFork || item == kFinderInfo) && !kept) continue;
                ways.push_back({from, to, item, from == to || item.empty()});
            }
        }
    }
    return ways;
}

Bytes ValueOf(const std::string& item) {
    if (item.empty()) return Ascii("data of the file, as it was");
    if (item == kFork) return Ascii("fork of " + kBlue);
    if (item == kFinderInfo) return Hex(FinderInfoDigits());
    return Ascii(kBlue);
}

class WrittenTest : public ::testing::TestWithParam<Way> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_UNLESS_STOPPED();
        const Way& way = GetParam();
        if (way.two_volumes) {
            second_.emplace();
            MAVOEA_SKIP_WITHOUT_SECOND(*second_);
        }
        travel_.emplace(way.from, way.to, second_ ? second_->path() : std::string());
        if (way.from == kXattr) MAVOEA_SKIP_WITHOUT_ATTRIBUTES(travel_->source());
        if (way.to == kXattr) MAVOEA_SKIP_WITHOUT_ATTRIBUTES(travel_->target());
        if (way.from == kFileEa) MAVOEA_SKIP_WITHOUT_ATTRIBUTES(travel_->source());
        if (way.to == kFileEa) MAVOEA_SKIP_WITHOUT_ATTRIBUTES(travel_->target());
        travel_->MakeFile(travel_->From("a"), "data of the file, as it was");
        travel_->GiveMetadata(travel_->From("a"), kBlue);
    }

    std::optional<SecondVolume> second_;
    std::optional<Travel> travel_;
};

INSTANTIATE_TEST_SUITE_P(Ways, WrittenTest, ::testing::ValuesIn(AllWays()));

// Promise: "The tool: They make each file"
TEST_P(WrittenTest, IsReadBackBeforeTheSourceGoes) {
    const std::string& item = GetParam().item;
    const Bytes value = ValueOf(item);
    bool spoiled = false;
    const StoppedRun run = RunStopped(
        travel_->WithVolumes({"mv", travel_->From("a"), travel_->To("a")}), travel_->dir().path(),
        [&](const FileCall& call) {
            spoiled = spoiled || Spoil(FilesIn(travel_->target(), call), value);
            return !spoiled;
        },
        Stops::kAtDataToo);
    EXPECT_TRUE(spoiled);
    if (GetParam().from == kXattr && GetParam().to == kXattr && !item.empty()) {
        // A file's own attributes come with its permissions, and then once more as its metadata.
        EXPECT_EQ(0, run.status) << run.err;
        return travel_->ExpectMetadata(travel_->To("a"), kBlue);
    }
    // What is wrong with metadata does not keep the object from arriving.
    ASSERT_EQ(item.empty() ? 1 : 2, run.status) << run.err;
    const std::string named = item.empty() ? travel_->To("a") : travel_->From("a");
    EXPECT_NE(std::string::npos, run.err.find(named)) << run.err;
    EXPECT_EQ("data of the file, as it was", TextOf(travel_->From("a")));
    travel_->ExpectMetadata(travel_->From("a"), kBlue);
}

// ---- What was read ------------------------------------------------------------------------------

// `change` comes once the destination has all of `wanted`.
class ReadTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_UNLESS_STOPPED();
        MAVOEA_SKIP_WITHOUT_SECOND(second_);
        travel_.emplace(kAppleDouble, kAppleDouble, second_.path());
    }

    StoppedRun RunAndChange(const char* command, const Bytes& wanted,
                            const std::function<void()>& change) {
        bool changed = false;
        const auto has_it = [&](const std::string& path) {
            return Find(ReadFile(path), wanted).has_value();
        };
        StoppedRun run =
            RunStopped(travel_->WithVolumes({command, travel_->From("a"), travel_->To("a")}),
                       travel_->dir().path(), [&](const FileCall& call) {
                           const auto files = FilesIn(travel_->target(), call);
                           if (std::none_of(files.begin(), files.end(), has_it)) return true;
                           change();
                           changed = true;
                           return false;
                       });
        EXPECT_TRUE(changed);
        return run;
    }

    SecondVolume second_;
    std::optional<Travel> travel_;
};

TEST_F(ReadTest, DataThatGrowsWhileItIsMovedStays) {
    travel_->MakeFile(travel_->From("a"), "first line\n");
    const StoppedRun run = RunAndChange("mv", Ascii("first line\n"), [&] {
        WriteFile(travel_->From("a"), Ascii("first line\nsecond line\n"));
    });
    ASSERT_EQ(1, run.status) << run.err;
    EXPECT_EQ("first line\nsecond line\n", TextOf(travel_->From("a")));
}

TEST_F(ReadTest, MetadataThatChangesWhileItIsMovedStays) {
    travel_->MakeFile(travel_->From("a"));
    travel_->GiveMetadata(travel_->From("a"), kBlue);
    const StoppedRun run = RunAndChange("mv", Ascii("fork of " + kBlue), [&] {
        EXPECT_TRUE(Spoil(FilesIn(travel_->source()), Ascii("fork of " + kBlue)));
    });
    ASSERT_EQ(1, run.status) << run.err;
    EXPECT_EQ("data", TextOf(travel_->From("a")));
    EXPECT_EQ("fork of blue as it wa" + std::string(1, 's' ^ 1),
              travel_->Run({"get", travel_->From("a"), kFork}).out);
}

TEST_F(ReadTest, DataThatShrinksWhileItIsCopiedDoesNotArriveAsZeros) {
    std::string data(1 << 20, 'x');
    data.replace(0, 5, "begin");
    travel_->MakeFile(travel_->From("a"), data);
    const StoppedRun run = RunAndChange(
        "cp", Ascii("begin"), [&] { EXPECT_EQ(0, truncate(travel_->From("a").c_str(), 0)); });
    ASSERT_EQ(1, run.status) << run.err;
    EXPECT_FALSE(Exists(travel_->To("a")));
}

}  // namespace
}  // namespace mavoea::test

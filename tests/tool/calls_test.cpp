// How many system calls with names, attributes or data an object takes: what a second object in the
// same directory adds, which is what large trees are made of. The bounds have little room, so that
// nothing looks twice at what it knows. And no file is opened twice.

#include <gtest/gtest.h>

#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "tests/tool/stopped_tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

struct Work {
    const char* name;
    int type;
    std::vector<std::string> command;  // the tree comes behind it
    bool carries;                      // to a second tree
    int most = 0;                      // calls for an object
    bool bare = false;                 // objects have no metadata
};
void PrintTo(const Work& work, std::ostream* out) { *out << work.name << "OnType" << work.type; }

class CallsTest : public ::testing::TestWithParam<Work> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_UNLESS_STOPPED();
    }

    // For a tree of so many objects, with two attributes and Finder info each, or bare.
    static int CallsFor(int count) {
        const Work& work = GetParam();
        const Travel travel(work.type, work.type);
        const fs::path tree = travel.From("tree");
        fs::create_directory(tree);
        travel.MakeFile(tree / "object000");
        if (!work.bare) GiveAll(travel, tree / "object000");
        for (int i = 1; i < count; ++i) CopyFirst(tree, 1000 + i);
        Arguments arguments = work.command;
        arguments.push_back(tree);
        if (work.carries) arguments.push_back(travel.To("tree"));
        const StoppedRun run = RunStopped(
            travel.WithVolumes(arguments), travel.dir().path(),
            [](const FileCall&) { return true; }, Stops::kAtDataToo);
        EXPECT_EQ(0, run.status) << run.err;
        return run.calls;
    }

 private:
    static void GiveAll(const Travel& travel, const std::string& path) {
        for (const char* const name : {"user.colour", "user.origin"}) {
            EXPECT_EQ(0, travel.Run({"set", path, name, "value"}).status);
        }
        EXPECT_EQ(
            0,
            travel.Run({"set", path, "com.apple.FinderInfo", "--hex", FinderInfoDigits()}).status);
    }

    // With all that lies beside it.
    static void CopyFirst(const fs::path& tree, int number) {
        const std::string name = "object" + std::to_string(number).substr(1);
        for (const fs::path& directory : {tree, tree / "@eaDir"}) {
            if (!fs::exists(directory)) continue;
            const fs::directory_iterator entries(directory);
            for (const fs::path& from : std::vector<fs::path>(begin(entries), end(entries))) {
                std::string to = from.filename();
                const std::size_t at = to.find("object000");
                if (at == std::string::npos) continue;
                to.replace(at, name.size(), name);
                fs::copy_file(from, directory / to);
            }
        }
    }
};

INSTANTIATE_TEST_SUITE_P(
    All, CallsTest,
    ::testing::Values(Work{"Copy", kAppleDouble, {"cp", "-r"}, true, 28},
                      Work{"Copy", kEaDirectory, {"cp", "-r"}, true, 34},
                      Work{"List", kAppleDouble, {"list", "-r"}, false, 6},
                      Work{"List", kEaDirectory, {"list", "-r"}, false, 8},
                      Work{"ListBare", kAppleDouble, {"list", "-r"}, false, 2, true},
                      Work{"ListBare", kEaDirectory, {"list", "-r"}, false, 1, true},
                      Work{"Remove", kAppleDouble, {"rm", "-r"}, false, 6},
                      Work{"Remove", kEaDirectory, {"rm", "-r"}, false, 7},
                      Work{"Upgrade", kEaDirectory, {"upgrade", "-r"}, false, 0}));

TEST_P(CallsTest, AnObjectTakesNoMoreThanItNeeds) {
    constexpr int kCount = 20;
    const int few = CallsFor(kCount);
    const int many = CallsFor(2 * kCount);
    EXPECT_LE(many - few, kCount * GetParam().most) << few << " and " << many;
}

// ---- Opened once --------------------------------------------------------------------------------

class OpensTest : public CallsTest {
 protected:
    static std::vector<std::string> FilesBelow(const fs::path& tree) {
        std::vector<std::string> files;
        if (!fs::exists(tree)) return files;
        for (const fs::directory_entry& entry : fs::recursive_directory_iterator(tree)) {
            if (entry.is_regular_file()) files.push_back(entry.path());
        }
        return files;
    }
};

INSTANTIATE_TEST_SUITE_P(
    All, OpensTest,
    ::testing::Values(Work{"Copy", kAppleDouble, {"cp", "-r"}, true},
                      Work{"Copy", kEaDirectory, {"cp", "-r"}, true},
                      Work{"Move", kAppleDouble, {"mv"}, true},
                      Work{"Move", kEaDirectory, {"mv"}, true},
                      Work{"Convert", kAppleDouble, {"convert", "-r", "--to", "1"}, true},
                      Work{"Convert", kEaDirectory, {"convert", "-r", "--to", "0"}, true},
                      Work{"List", kAppleDouble, {"list", "-r"}, false},
                      Work{"List", kEaDirectory, {"list", "-r"}, false},
                      Work{"Remove", kAppleDouble, {"rm", "-r"}, false},
                      Work{"Remove", kEaDirectory, {"rm", "-r"}, false}));

TEST_P(OpensTest, NoFileIsOpenedTwice) {
    const SecondVolume second;
    if (!second.ok()) GTEST_SKIP() << "no second file system";
    const Work& work = GetParam();
    const Travel travel(work.type, work.type, second.path());
    const fs::path tree = travel.From("tree");
    fs::create_directories(tree / "inner");
    for (const char* const name : {"first", "second", "inner/third"}) {
        travel.MakeFile(tree / name);
        travel.GiveMetadata(tree / name);
    }
    Arguments arguments = work.command;
    arguments.push_back(tree);
    if (work.carries) arguments.push_back(travel.To("tree"));
    std::vector<std::string> files = FilesBelow(tree);
    ASSERT_LE(6, files.size());
    std::map<std::string, int> opened;
    const StoppedRun run =
        RunStopped(travel.WithVolumes(arguments), travel.dir().path(), [&](const FileCall& call) {
            if (!call.name.starts_with("open")) return true;
            for (const FileCall::LookUp& look_up : call.look_ups) ++opened[look_up.path];
            return true;
        });
    EXPECT_EQ(0, run.status) << run.err;
    for (const std::string& made : FilesBelow(travel.To("tree"))) files.push_back(made);
    int most = 0;
    for (const std::string& file : files) {
        const int times = opened[file];
        EXPECT_LE(times, 1) << file;
        most = std::max(most, times);
    }
    // Without metadata beside them files go unopened.
    EXPECT_EQ(work.command.front() == "rm" && work.type == kEaDirectory ? 0 : 1, most);
}

}  // namespace
}  // namespace mavoea::test

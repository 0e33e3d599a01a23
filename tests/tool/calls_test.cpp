// How many system calls with names, attributes or data an object takes: what a second object in the
// same directory adds, which is what large trees are made of. The bounds have little room, so that
// nothing looks twice at what it knows.

#include <gtest/gtest.h>

#include <filesystem>
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
    int most;                          // calls for an object
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
    ::testing::Values(Work{"Copy", kAppleDouble, {"cp", "-r"}, true, 33},
                      Work{"Copy", kEaDirectory, {"cp", "-r"}, true, 34},
                      Work{"List", kAppleDouble, {"list", "-r"}, false, 10},
                      Work{"List", kEaDirectory, {"list", "-r"}, false, 9},
                      Work{"ListBare", kAppleDouble, {"list", "-r"}, false, 2, true},
                      Work{"ListBare", kEaDirectory, {"list", "-r"}, false, 1, true},
                      Work{"Remove", kAppleDouble, {"rm", "-r"}, false, 16},
                      Work{"Remove", kEaDirectory, {"rm", "-r"}, false, 14},
                      Work{"Upgrade", kEaDirectory, {"upgrade", "-r"}, false, 0}));

TEST_P(CallsTest, AnObjectTakesNoMoreThanItNeeds) {
    constexpr int kCount = 20;
    const int few = CallsFor(kCount);
    const int many = CallsFor(2 * kCount);
    EXPECT_LE(many - few, kCount * GetParam().most) << few << " and " << many;
}

}  // namespace
}  // namespace mavoea::test

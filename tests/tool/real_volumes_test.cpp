// Objects that travel between file systems that are really mounted, whose types nobody declares.

#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "tests/support/process.h"
#include "tests/support/temp_dir.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

// What a volume of each kind is made of, as far as this machine can.
constexpr const char* kFilesystems[] = {"ext4", "xfs", "btrfs", "tmpfs"};

const std::string kFinderInfo = "5445585474747874000000000000000000000000000000000000000000000001";

// The four file systems, mounted where no other process sees them.
class RealVolumes {
 public:
    RealVolumes() {
        static const bool alone = unshare(CLONE_NEWNS) == 0 &&
                                  mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
        if (!alone || mount("none", room_.path().c_str(), "tmpfs", 0, "") != 0) return;
        has_room_ = true;
        for (const char* name : kFilesystems) Mount(name);
    }
    ~RealVolumes() {
        for (const auto& [name, path] : paths_) umount2(path.c_str(), MNT_DETACH);
        if (has_room_) umount2(room_.path().c_str(), MNT_DETACH);
    }
    RealVolumes(const RealVolumes&) = delete;
    RealVolumes& operator=(const RealVolumes&) = delete;

    const std::map<std::string, std::string>& paths() const { return paths_; }

 private:
    void Mount(const std::string& name) {
        const std::string path = room_ / name;
        const std::string disk = room_ / (name + ".disk");
        if (mkdir(path.c_str(), 0755) != 0) return;
        std::string command = "mount -t tmpfs none " + Quoted(path);
        if (name != "tmpfs") {
            WriteFile(disk, {});
            if (truncate(disk.c_str(), 512 << 20) != 0) return;  // holes, but for what mkfs writes
            command = "mkfs." + name + " " + Quoted(disk) + " && mount -t " + name + " -o loop " +
                      Quoted(disk) + " " + Quoted(path);
        }
        command = "PATH=/usr/sbin:/sbin:$PATH; exec >/dev/null 2>&1; " + command;
        if (std::system(command.c_str()) == 0) paths_[name] = path;
    }

    TempDir room_;
    bool has_room_ = false;
    std::map<std::string, std::string> paths_;
};

void MakeObject(const std::string& path) {
    WriteFile(path, Ascii("data"));
    ASSERT_THAT(RunTool({"set", path, "com.example.colour", "blue"}), Succeeded());
    ASSERT_THAT(RunTool({"set", path, "com.apple.FinderInfo", "--hex", kFinderInfo}), Succeeded());
    ASSERT_THAT(RunTool({"set", path, "com.apple.ResourceFork", "the fork"}), Succeeded());
}

void ExpectObject(const std::string& path) {
    EXPECT_EQ(Ascii("data"), ReadFile(path));
    EXPECT_EQ("blue", RunTool({"get", path, "com.example.colour"}).out);
    EXPECT_EQ("the fork", RunTool({"get", path, "com.apple.ResourceFork"}).out);
    const Bytes finder_info = RunTool({"get", path, "com.apple.FinderInfo"}).bytes();
    ASSERT_EQ(32U, finder_info.size());
    EXPECT_EQ(Ascii("TEXTttxt"), Bytes(finder_info.begin(), finder_info.begin() + 8));
    EXPECT_EQ(1, finder_info.back());
}

TEST(RealVolumesTest, MetadataTravelsBetweenEveryTwo) {
    const RealVolumes volumes;
    if (volumes.paths().size() < 2) GTEST_SKIP() << "needs the superuser and loop devices";
    std::vector<std::array<std::string, 2>> pairs;
    for (const auto& [from, source] : volumes.paths()) {
        for (const auto& [to, target] : volumes.paths()) pairs.push_back({source, target});
    }
    for (const auto& [source, target] : Thinned(pairs)) {
        SCOPED_TRACE(source + " to " + target);
        MakeObject(source + "/object");
        ASSERT_THAT(RunTool({"cp", source + "/object", target + "/copy"}), Succeeded());
        ExpectObject(target + "/copy");
        ExpectObject(source + "/object");
        ASSERT_THAT(RunTool({"mv", source + "/object", target + "/moved"}), Succeeded());
        ExpectObject(target + "/moved");
        EXPECT_FALSE(Exists(source + "/object"));
        ASSERT_THAT(RunTool({"rm", target + "/copy", target + "/moved"}), Succeeded());
        EXPECT_FALSE(Exists(target + "/@eaDir"));
        EXPECT_FALSE(Exists(source + "/@eaDir"));
    }
}

TEST(RealVolumesTest, ATreeIsConvertedAndComesBackTheSame) {
    const RealVolumes volumes;
    if (volumes.paths().size() < 2) GTEST_SKIP() << "needs the superuser and loop devices";
    for (const auto& [from, source] : volumes.paths()) {
        SCOPED_TRACE(from);
        const std::string tree = source + "/tree";
        const std::string away = source + "/away";
        const std::string back = source + "/back";
        ASSERT_EQ(0, mkdir(tree.c_str(), 0755));
        ASSERT_EQ(0, mkdir((tree + "/folder").c_str(), 0755));
        MakeObject(tree + "/one");
        MakeObject(tree + "/folder/two");
        const std::string type = from == "btrfs" ? "fileea" : "eadir";
        EXPECT_EQ(0, RunTool({"convert", "-r", "--to", "appledouble", tree, away}).status);
        EXPECT_TRUE(Exists(away + "/folder/._two"));
        EXPECT_EQ(0, RunTool({"--volume", away + "=appledouble", "convert", "-r", "--to", type,
                              away, back})
                         .status);
        ExpectObject(back + "/one");
        ExpectObject(back + "/folder/two");
    }
}

// ext4 has a few bytes in the inode, and one block, for all attributes of an object.
TEST(RealVolumesTest, DryRunsAndPlansKnowForWhatThereIsNoRoom) {
    const RealVolumes volumes;
    if (!volumes.paths().contains("ext4")) GTEST_SKIP() << "needs the superuser and loop devices";
    const TempDir here;
    const std::string there = volumes.paths().at("ext4");
    std::set<int> statuses;
    int next = 0;
    for (const std::size_t other : {std::size_t{0}, std::size_t{40}, std::size_t{100}}) {
        for (const std::size_t size : {100U, 3000U, 3900U, 3950U, 3980U, 4000U, 4008U, 4012U, 4016U,
                                       4020U, 4028U, 4032U, 4100U, 60000U}) {
            SCOPED_TRACE(std::to_string(other) + " and " + std::to_string(size));
            const std::string name = std::to_string(next++);
            const std::string from = here / name;
            const std::string to = there + "/" + name;
            WriteFile(from, Ascii("data"));
            const std::string value(size, 'x');
            ASSERT_EQ(0, RunTool({"set", from, "com.example.large"}, value).status);
            if (other > 0) {
                const std::string second(other, 'y');
                ASSERT_EQ(0, RunTool({"set", from, "com.example.small"}, second).status);
            }
            const Arguments kind = {"--volume", there + "=samba", "cp"};
            Arguments dry = kind;
            dry.insert(dry.end(), {"--dry-run", from, to});
            const ToolResult said = RunTool(dry);
            EXPECT_FALSE(Exists(to));
            const ToolResult planned =
                RunTool({"--volume", there + "=samba", "plan", "--to", "samba", from, to});
            Arguments real = kind;
            real.insert(real.end(), {from, to});
            const ToolResult done = RunTool(real);
            EXPECT_EQ(done.status, said.status);
            EXPECT_EQ(done.err, said.err);
            EXPECT_EQ(done.status == 0 ? 0 : 1, planned.status) << planned.out;
            statuses.insert(done.status);
        }
    }
    EXPECT_THAT(statuses, ::testing::ElementsAre(0, 2));
}

}  // namespace
}  // namespace mavoea::test

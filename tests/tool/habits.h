// Objects whose metadata says whose it is, on volumes of one kind, and what a command leaves of
// them.
#ifndef MAVOEA_TESTS_TOOL_HABITS_H_
#define MAVOEA_TESTS_TOOL_HABITS_H_

#include <sys/mount.h>

#include <algorithm>
#include <string>
#include <vector>

#include "tests/support/working_directory.h"
#include "tests/tool/holdings.h"
#include "tests/tool/travel.h"

namespace mavoea::test {

// The directories "from" and "to" are two volumes of the type, and the working directory is the one
// that holds both.
class HabitsTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    }

    static int type() { return GetParam(); }
    ToolResult Run(const Arguments& arguments, const std::string& input = {}) const {
        return travel_.Run(arguments, input);
    }

    // What the tool says in the place of the command `name`, on standard error as well.
    static ProgramResult RunAs(const std::string& name, const std::string& words) {
        const TempDir bin;
        std::filesystem::create_symlink(Tested().path, bin / name);
        const std::string is = '=' + std::to_string(type());
        return RunProgram(Quoted(bin / name) + " --volume from" + is + " --volume to" + is + ' ' +
                          words + " 2>&1");
    }

    // Everybody may write everywhere here.
    void OpenForAll() const {
        for (const std::string& path : {travel_.dir().path(), travel_.source(), travel_.target()}) {
            ASSERT_EQ(0, chmod(path.c_str(), 0777));
        }
    }

    static Bytes FinderInfoOf(const std::string& owner) {
        return Repeat(static_cast<std::uint8_t>(owner.front()), 32);
    }

    // What nobody else has: an attribute of its name, Finder info and a fork.
    void Give(const std::string& path, const std::string& owner) const {
        ASSERT_EQ(0, Run({"set", path, "user.colour", owner}).status) << path;
        ASSERT_EQ(0, Run({"set", path, "user.of." + owner, owner}).status) << path;
        if (!KeepsFork(type())) return;
        const Bytes info = FinderInfoOf(owner);
        ASSERT_EQ(
            0, Run({"set", path, kFinderInfoName}, std::string(info.begin(), info.end())).status);
        ASSERT_EQ(0, Run({"set", path, kForkName, "fork of " + owner}).status);
    }
    // A file of an owner, with data that names it, in the place of what was there.
    void Make(const std::string& path, const std::string& owner) const {
        if (Exists(path)) {
            ASSERT_THAT(Run({"rm", "-f", path}), Succeeded());
        }
        WriteFile(path, Ascii("data of " + owner));
        Give(path, owner);
    }
    void MakeDirectory(const std::string& path, const std::string& owner) const {
        ASSERT_EQ(0, mkdir(path.c_str(), 0755)) << path;
        Give(path, owner);
    }

    // All of its owner's, and nothing of anybody else's.
    static void ExpectMetadata(const std::string& path, const std::string& owner) {
        SCOPED_TRACE(path);
        const Holdings found = HoldingsOf(type(), path);
        EXPECT_TRUE(found.HasAttribute({"user.colour", Ascii(owner)}));
        EXPECT_THAT(OwnersIn(found), ::testing::ElementsAre("user.of." + owner));
        if (!KeepsFork(type())) return;
        // Volumes of type 2 have it in two places.
        EXPECT_TRUE(found.HasFinderInfo(FinderInfoOf(owner)));
        EXPECT_THAT(found.finder_infos, ::testing::Each(FinderInfoOf(owner)));
        EXPECT_THAT(found.forks, ::testing::ElementsAre(Ascii("fork of " + owner)));
    }
    static void ExpectNoMetadata(const std::string& path) {
        SCOPED_TRACE(path);
        const Holdings found = HoldingsOf(type(), path);
        EXPECT_THAT(OwnersIn(found), ::testing::IsEmpty());
        EXPECT_FALSE(found.attributes.contains("user.colour"));
        EXPECT_THAT(found.finder_infos, ::testing::IsEmpty());
        EXPECT_THAT(found.forks, ::testing::IsEmpty());
    }
    static void ExpectWhole(const std::string& path, const std::string& owner) {
        ASSERT_TRUE(Exists(path)) << path;
        EXPECT_EQ("data of " + owner, TextOf(path)) << path;
        ExpectMetadata(path, owner);
    }

    static void SetTime(const std::string& path, time_t time) {
        const timespec times[] = {{time, 0}, {time, 0}};
        ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW)) << path;
    }
    static ino_t InodeOf(const std::string& path) { return StatusOf(path).st_ino; }

    const Travel travel_{type(), type()};
    const WorkingDirectory here_{travel_.dir().path()};

 private:
    static std::vector<std::string> OwnersIn(const Holdings& found) {
        std::vector<std::string> names;
        for (const auto& [name, attribute] : found.attributes) {
            if (name.starts_with("user.of.")) names.push_back(name);
        }
        return names;
    }
};

inline std::string TypeName(const ::testing::TestParamInfo<int>& info) {
    return "Type" + std::to_string(info.param);
}

// Holds a lock of the whole file, as a service does that changes it.
class HeldLock {
 public:
    explicit HeldLock(const std::string& path) : fd_(open(path.c_str(), O_RDWR | O_CLOEXEC)) {
        struct flock lock = {};
        lock.l_type = F_WRLCK;
        lock.l_whence = SEEK_SET;
        EXPECT_EQ(0, fcntl(fd_, F_SETLK, &lock)) << path;
    }
    ~HeldLock() { close(fd_); }
    HeldLock(const HeldLock&) = delete;
    HeldLock& operator=(const HeldLock&) = delete;

 private:
    int fd_;
};

// What a volume of the type keeps beside an object that the test has given all.
inline std::string MetadataFileOf(int type, const std::string& object) {
    const MetadataPaths paths(object);
    return UsesAppleDouble(type) ? paths.apple_double : paths.stream;
}

// A file system of its own that is mounted on a directory for as long as its scope lasts.
class MountedHere {
 public:
    explicit MountedHere(const std::string& path) : path_(path) {
        const SecondVolume alone("", true);  // takes a mount name space of the test's own
        mounted_ = alone.ok() && mount("none", path.c_str(), "tmpfs", 0, "size=64k") == 0;
    }
    ~MountedHere() {
        if (mounted_) umount2(path_.c_str(), MNT_DETACH);
    }
    MountedHere(const MountedHere&) = delete;
    MountedHere& operator=(const MountedHere&) = delete;

    bool ok() const { return mounted_; }

 private:
    std::string path_;
    bool mounted_ = false;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_HABITS_H_

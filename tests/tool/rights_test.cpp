// Who may read and change what the tool makes: the people who may do so with the object, at every
// moment.

#include <gtest/gtest.h>
#include <linux/posix_acl.h>
#include <linux/posix_acl_xattr.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <map>
#include <set>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/stopped_tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

constexpr uid_t kOwner = 1234;
constexpr gid_t kGroup = 4321;
constexpr uid_t kFriend = 5555;  // whom an ACL names
constexpr uid_t kStranger = 6666;

const std::vector<mode_t> kModes = {0600, 0640, 0644, 0664, 0755, 0444};
const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";

// ---- Rights -------------------------------------------------------------------------------------

constexpr char kAclAttribute[] = "system.posix_acl_access";

struct AclEntry {
    unsigned tag;
    unsigned permissions;
    unsigned id;

    bool operator==(const AclEntry&) const = default;
};

struct Rights {
    uid_t owner = 0;
    gid_t group = 0;
    mode_t mode = 0;
    std::vector<AclEntry> acl = {};  // empty: none but the mode

    bool operator==(const Rights&) const = default;
};

void PrintTo(const Rights& rights, std::ostream* out) {
    *out << rights.owner << ':' << rights.group << ' ' << std::oct << rights.mode << std::dec;
    for (const AclEntry& entry : rights.acl) {
        *out << ' ' << entry.tag << ':' << static_cast<int>(entry.id) << ':' << entry.permissions;
    }
}

// An attribute's fields have the lowest byte first on any machine.
std::uint32_t Little(const Bytes& bytes, std::size_t at, std::size_t size) {
    std::uint32_t value = 0;
    for (std::size_t i = size; i-- > 0;) value = value << 8 | bytes[at + i];
    return value;
}

void AppendLittle(Bytes* bytes, std::uint32_t value, int size) {
    for (; size > 0; --size, value >>= 8) bytes->push_back(static_cast<std::uint8_t>(value));
}

std::vector<AclEntry> AclOf(const std::string& path) {
    Bytes bytes(1024);
    const ssize_t size = getxattr(path.c_str(), kAclAttribute, bytes.data(), bytes.size());
    std::vector<AclEntry> acl;
    for (std::size_t at = 4; at + 8 <= static_cast<std::size_t>(std::max<ssize_t>(size, 0));
         at += 8) {
        acl.push_back({Little(bytes, at, 2), Little(bytes, at + 2, 2), Little(bytes, at + 4, 4)});
    }
    return acl;
}

bool SetAcl(const std::string& path, const std::vector<AclEntry>& acl) {
    Bytes bytes;
    AppendLittle(&bytes, POSIX_ACL_XATTR_VERSION, 4);
    for (const AclEntry& entry : acl) {
        AppendLittle(&bytes, entry.tag, 2);
        AppendLittle(&bytes, entry.permissions, 2);
        AppendLittle(&bytes, entry.id, 4);
    }
    return setxattr(path.c_str(), kAclAttribute, bytes.data(), bytes.size(), 0) == 0;
}

Rights RightsOf(const std::string& path) {
    const struct stat info = StatusOf(path);
    return {info.st_uid, info.st_gid, info.st_mode & 07777, AclOf(path)};
}

// What a file of metadata has of its object's: nobody can run it.
Rights WithoutExecution(Rights rights) {
    rights.mode &= 0666;
    for (AclEntry& entry : rights.acl) entry.permissions &= 6;
    return rights;
}

// Who may do what, the superuser aside, who may do everything.
using People = std::map<std::string, unsigned>;

People PeopleOf(const Rights& rights) {
    People people;
    const auto add = [&people](const std::string& who, unsigned permissions) {
        if (permissions != 0) people[who] |= permissions;
    };
    if (rights.owner != 0) add("user " + std::to_string(rights.owner), rights.mode >> 6 & 7);
    add("anybody", rights.mode & 7);
    // With an ACL the mode shows its mask.
    const unsigned mask = rights.mode >> 3 & 7;
    if (rights.acl.empty()) add("group " + std::to_string(rights.group), mask);
    for (const AclEntry& entry : rights.acl) {
        const unsigned permissions = entry.permissions & mask;
        if (entry.tag == ACL_USER) add("user " + std::to_string(entry.id), permissions);
        if (entry.tag == ACL_GROUP) add("group " + std::to_string(entry.id), permissions);
        if (entry.tag == ACL_GROUP_OBJ) add("group " + std::to_string(rights.group), permissions);
    }
    return people;
}

// Those of `some` who are none of `all`, or may do more.
People NotAmong(const People& some, const People& all, unsigned permissions) {
    People more;
    for (const auto& [who, may] : some) {
        const auto found = all.find(who);
        const unsigned may_there = found == all.end() ? 0 : found->second;
        if ((may & permissions & ~may_there) != 0) more[who] = may & ~may_there;
    }
    return more;
}

std::string Octal(mode_t mode) {
    char text[16];
    snprintf(text, sizeof text, "%04o", static_cast<unsigned>(mode));
    return text;
}

std::string OctalModeOf(const std::string& path) { return Octal(StatusOf(path).st_mode & 07777); }

// ---- Objects ------------------------------------------------------------------------------------

// An object that is made for a test: its mode, and whether an ACL names another user.
struct Kind {
    mode_t mode;
    bool acl;

    std::string Name() const { return Octal(mode) + (acl ? "acl" : ""); }
};

std::vector<Kind> AllKinds() {
    std::vector<Kind> kinds;
    for (const mode_t mode : kModes) {
        for (const bool acl : {false, true}) kinds.push_back({mode, acl});
    }
    return kinds;
}

// The group itself may do less than the mode shows, which is what the mask lets through.
std::vector<AclEntry> AclFor(const Kind& kind) {
    constexpr unsigned kNoId = 0xFFFFFFFF;
    const unsigned mode = kind.mode;
    return {{ACL_USER_OBJ, mode >> 6 & 7, kNoId},
            {ACL_USER, 5, kFriend},
            {ACL_GROUP_OBJ, 0, kNoId},
            {ACL_MASK, mode >> 3 & 7, kNoId},
            {ACL_OTHER, mode & 7, kNoId}};
}

void GiveRights(const std::string& path, const Kind& kind) {
    ASSERT_EQ(0, chown(path.c_str(), kOwner, kGroup)) << path;
    // An ACL of before would take the mode for its mask.
    ASSERT_TRUE(AclOf(path).empty() || removexattr(path.c_str(), kAclAttribute) == 0) << path;
    ASSERT_EQ(0, chmod(path.c_str(), kind.mode)) << path;
    ASSERT_TRUE(!kind.acl || SetAcl(path, AclFor(kind))) << path << ": " << strerror(errno);
}

void MakeObject(const std::string& path, const Kind& kind) {
    WriteFile(path, Ascii("data"));
    GiveRights(path, kind);
}

// Metadata files, which anybody may change, as earlier versions made them.
void MakeSidecars(int type, const std::string& parent, const std::string& name) {
    const StreamImage stream = {.attributes = {{"user.colour", Ascii("blue")}},
                                .fork = Ascii("fork"),
                                .finder_info = Pattern(32, 1)};
    std::vector<std::string> paths;
    if (type == kAppleDouble) {
        paths = {parent + "/._" + name};
        WriteFile(paths[0], stream.Build());
    } else {
        const ObjectFiles files = {parent, name};
        MakeDir(files.ea_dir());
        ASSERT_EQ(0, chmod(files.ea_dir().c_str(), 0777));
        paths = {files.stream(), files.resource()};
        WriteFile(paths[0], StreamImage{.attributes = stream.attributes}.Build());
        WriteFile(paths[1], ClassicFile(stream.finder_info, stream.fork).bytes);
    }
    for (const std::string& path : paths) ASSERT_EQ(0, chmod(path.c_str(), 0777));
}

std::vector<std::string> SidecarsOf(const std::string& parent, const std::string& name) {
    const ObjectFiles files = {parent, name};
    std::vector<std::string> paths = {files.sidecar(), files.stream(), files.resource()};
    std::erase_if(paths, [](const std::string& path) { return !Exists(path); });
    return paths;
}

void ExpectRightsOfObject(const std::string& parent, const std::string& name) {
    const std::vector<std::string> sidecars = SidecarsOf(parent, name);
    EXPECT_FALSE(sidecars.empty()) << parent << '/' << name;
    const Rights wanted = WithoutExecution(RightsOf(parent + '/' + name));
    for (const std::string& path : sidecars) EXPECT_EQ(wanted, RightsOf(path)) << path;
}

bool KeepsAcls(const std::string& parent) {
    const TempDir probe(parent);
    return SetAcl(probe.path(), AclFor({0777, true}));
}

#define MAVOEA_SKIP_WITHOUT_ACLS(directory) \
    if (!KeepsAcls(directory)) GTEST_SKIP() << "files in " << (directory) << " keep no ACLs"

// Where these tests have their volumes: where that is quickest, if files there keep all they
// should.
std::string Here() {
    static const std::string here =
        KeepsUserAttributes(FastDirectory()) && KeepsAcls(FastDirectory())
            ? FastDirectory()
            : std::filesystem::temp_directory_path().string();
    return here;
}

// ---- In the end ---------------------------------------------------------------------------------

class RightsTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(Here());
        MAVOEA_SKIP_WITHOUT_ACLS(Here());
    }

    // An object of each kind, and what the tool does with it.
    void EachKind(const std::function<void(const Volume&)>& make) const {
        for (const Kind& kind : Thinned(AllKinds())) {
            SCOPED_TRACE(kind.Name());
            const Volume volume(GetParam(), Here());
            GiveRights(volume.object(), kind);
            make(volume);
            ExpectRightsOfObject(volume.path(), "file.txt");
        }
    }

    const Umask none_{0};
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, RightsTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(RightsTest, WhatHoldsANewAttributeHasItsObjects) {
    EachKind([](const Volume& volume) {
        EXPECT_THAT(volume.Set("colour", Ascii("blue")), Succeeded());
    });
}

TEST_P(RightsTest, WhatHoldsNewFinderInfoHasItsObjects) {
    EachKind([](const Volume& volume) {
        EXPECT_THAT(volume.Set(kFinderInfo, Pattern(32, 1)), Succeeded());
    });
}

TEST_P(RightsTest, WhatHoldsANewForkHasItsObjects) {
    EachKind(
        [](const Volume& volume) { EXPECT_THAT(volume.Set(kFork, Ascii("fork")), Succeeded()); });
}

TEST_P(RightsTest, WhatHoldsAnImportedFileHasItsObjects) {
    EachKind([](const Volume& volume) {
        const TempDir incoming;
        const std::string file = incoming / "incoming";
        WriteFile(file,
                  MacSidecar({{{"colour", Ascii("blue")}}, Pattern(32, 1), Ascii("fork")}).bytes);
        EXPECT_THAT(volume.Run({"import", file, volume.object()}), Succeeded());
    });
}

TEST_P(RightsTest, WhatHoldsMetadataOfADirectoryHasTheDirectorysWithoutExecution) {
    for (const mode_t mode : {0700U, 0750U, 0755U, 0777U}) {
        const Volume volume(GetParam(), Here());
        const std::string directory = volume.path() + "/directory";
        MakeDir(directory);
        GiveRights(directory, {mode, false});
        EXPECT_THAT(volume.Run({"set", directory, "colour", "blue"}), Succeeded());
        ExpectRightsOfObject(volume.path(), "directory");
    }
}

TEST_P(RightsTest, TheUmaskTakesNothingAway) {
    const Umask most(077);
    EachKind([](const Volume& volume) {
        EXPECT_THAT(volume.Set("colour", Ascii("blue")), Succeeded());
    });
}

TEST_P(RightsTest, WhatAnUpgradeMakesHasItsObjects) {
    if (GetParam() == kAppleDouble) GTEST_SKIP() << "AppleDouble volumes have one layout only";
    EachKind([](const Volume& volume) {
        const ObjectFiles files = {volume.path(), "file.txt"};
        files.MakeLegacy("colour");
        EXPECT_THAT(volume.Run({"upgrade", volume.object()}), Succeeded());
        EXPECT_TRUE(Exists(files.stream()));
    });
}

TEST_P(RightsTest, WhatARepairMakesHasItsObjects) {
    if (GetParam() == kAppleDouble) GTEST_SKIP() << "AppleDouble volumes have no resource files";
    for (const Kind& kind : Thinned(AllKinds())) {
        SCOPED_TRACE(kind.Name());
        const Volume volume(GetParam(), Here());
        GiveRights(volume.object(), kind);
        const ObjectFiles files = {volume.path(), "file.txt"};
        MakeDir(files.ea_dir());
        WriteFile(files.resource(), StreamImage{.attributes = {{"colour", Ascii("blue")}}}.Build());
        GiveRights(files.resource(), {kind.mode & 0666, false});
        EXPECT_THAT(volume.Run({"repair", volume.object()}), Succeeded());
        EXPECT_EQ(WithoutExecution(RightsOf(volume.object())), RightsOf(files.stream()));
        // It was there before; but no more people than before or as with its object have it.
        People people = PeopleOf(RightsOf(volume.object()));
        for (const auto& [who, may] : PeopleOf({kOwner, kGroup, kind.mode & 0666})) {
            people[who] |= may;
        }
        EXPECT_EQ(People(), NotAmong(PeopleOf(RightsOf(files.resource())), people, 7));
    }
}

// ---- On its way to another volume ---------------------------------------------------------------

struct Way {
    const char* name;
    int from;
    int to;
    bool two_volumes;
};
void PrintTo(const Way& way, std::ostream* out) { *out << way.name; }

class RightsOnTheWayTest : public ::testing::TestWithParam<Way> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(Here());
        MAVOEA_SKIP_WITHOUT_ACLS(Here());
        if (GetParam().two_volumes) {
            second_.emplace();
            MAVOEA_SKIP_WITHOUT_SECOND(*second_);
        }
        travel_.emplace(GetParam().from, GetParam().to, second_ ? second_->path() : "");
        const std::string tree = travel_->From("tree");
        MakeDir(tree);
        for (const Kind& kind : AllKinds()) {
            MakeObject(tree + '/' + kind.Name(), kind);
            MakeSidecars(GetParam().from, tree, kind.Name());
        }
        MakeDir(tree + "/directory");
        GiveRights(tree + "/directory", {0750, false});
        MakeSidecars(GetParam().from, tree, "directory");
    }

    void ExpectRights() const {
        const std::string tree = travel_->To("tree");
        for (const Kind& kind : AllKinds()) {
            SCOPED_TRACE(kind.Name());
            const Rights object = RightsOf(tree + '/' + kind.Name());
            EXPECT_EQ(kOwner, object.owner);
            EXPECT_EQ(kGroup, object.group);
            EXPECT_EQ(kind.acl, !object.acl.empty());
            ExpectRightsOfObject(tree, kind.Name());
        }
        ExpectRightsOfObject(tree, "directory");
    }

    const Umask none_{0};
    std::optional<SecondVolume> second_;
    std::optional<Travel> travel_;
};
INSTANTIATE_TEST_SUITE_P(Ways, RightsOnTheWayTest,
                         ::testing::Values(Way{"BetweenAppleDoubleFiles", 0, 0, true},
                                           Way{"ToEaDirectories", 0, 1, false},
                                           Way{"ToRecords", 0, 2, false},
                                           Way{"ToAppleDoubleFiles", 1, 0, false},
                                           Way{"BetweenEaDirectories", 1, 1, true},
                                           Way{"FromEaDirectoriesToRecords", 1, 2, false},
                                           Way{"FromRecords", 2, 0, false},
                                           Way{"FromRecordsToEaDirectories", 2, 1, false},
                                           Way{"BetweenRecords", 2, 2, true}),
                         [](const auto& tested) { return tested.param.name; });

TEST_P(RightsOnTheWayTest, WhatIsCopiedHasItsObjects) {
    const ToolResult result = travel_->Run({"cp", "-a", travel_->From("tree"), travel_->target()});
    EXPECT_EQ(0, result.status) << result.err;
    ExpectRights();
}

TEST_P(RightsOnTheWayTest, WhatIsConvertedHasItsObjects) {
    const ToolResult result = travel_->Run({"convert", "-r", "--to", std::to_string(GetParam().to),
                                            travel_->From("tree"), travel_->To("tree")});
    EXPECT_EQ(0, result.status) << result.err;
    ExpectRights();
}

TEST_P(RightsOnTheWayTest, WhatIsMovedHasItsObjects) {
    const ToolResult result = travel_->Run({"mv", travel_->From("tree"), travel_->target()});
    EXPECT_EQ(0, result.status) << result.err;
    ExpectRights();
}

// ---- For whom -----------------------------------------------------------------------------------

class PeopleTest : public RightsTest {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_WITHOUT_OTHER_USERS();
        RightsTest::SetUp();
        if (IsSkipped()) return;
        GiveRights(volume_.object(), {0600, false});
        ASSERT_THAT(volume_.Set("colour", Ascii("blue")), Succeeded());
        ASSERT_THAT(volume_.Set(kFinderInfo, Pattern(32, 1)), Succeeded());
        ASSERT_THAT(volume_.Set(kFork, Ascii("fork")), Succeeded());
    }

    Volume volume_{GetParam(), Here()};
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, PeopleTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(PeopleTest, OthersReadNothingOfWhatIsPrivate) {
    const std::vector<std::string> sidecars = SidecarsOf(volume_.path(), "file.txt");
    ASSERT_FALSE(sidecars.empty());
    AsUser(kStranger, Root::kGivenUp, [&] {
        for (const std::string& path : sidecars) EXPECT_NE(0, access(path.c_str(), R_OK)) << path;
        for (const std::string& name : {std::string("colour"), kFinderInfo, kFork}) {
            const ToolResult result = volume_.Get(name);
            EXPECT_EQ(2, result.status) << name;
            EXPECT_EQ("", result.out);
            EXPECT_NE(0, volume_.Set(name, Pattern(32, 9)).status) << name;
        }
    });
    EXPECT_EQ("blue", volume_.Get("colour").out);
    EXPECT_EQ("fork", volume_.Get(kFork).out);
}

TEST_P(PeopleTest, TheOwnerReadsAndChangesWhatTheSuperuserMade) {
    AsUser(kOwner, Root::kGivenUp, [&] {
        EXPECT_EQ("blue", volume_.Get("colour").out);
        EXPECT_EQ(Pattern(32, 1), volume_.Get(kFinderInfo).bytes());
        EXPECT_EQ("fork", volume_.Get(kFork).out);
        EXPECT_THAT(volume_.Set("colour", Ascii("red")), Succeeded());
        EXPECT_THAT(volume_.Set("new", Ascii("value")), Succeeded());
        EXPECT_THAT(volume_.Set(kFinderInfo, Pattern(32, 2)), Succeeded());
        EXPECT_THAT(volume_.Set(kFork, Ascii("another fork")), Succeeded());
        EXPECT_THAT(volume_.Remove("colour"), Succeeded());
    });
    EXPECT_EQ("value", volume_.Get("new").out);
    EXPECT_EQ(1, volume_.Get("colour").status);
    EXPECT_EQ(Pattern(32, 2), volume_.Get(kFinderInfo).bytes());
    EXPECT_EQ("another fork", volume_.Get(kFork).out);
    ExpectRightsOfObject(volume_.path(), "file.txt");
}

TEST(UsersRightsTest, WhatTheOwnerMakesHasItsObjects) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MAVOEA_SKIP_WITHOUT_ACLS(Here());
    for (const Kind& kind : Thinned(AllKinds())) {
        SCOPED_TRACE(kind.Name());
        const Volume volume(kAppleDouble, Here());
        GiveRights(volume.object(), kind);
        AsUser(kOwner, Root::kGivenUp,
               [&] { EXPECT_THAT(volume.Set("colour", Ascii("blue")), Succeeded()); });
        const Rights made = RightsOf(volume.apple_double());
        Rights wanted = WithoutExecution(RightsOf(volume.object()));
        wanted.group = made.group;  // only the superuser could give it to the object's
        EXPECT_EQ(kOwner, made.owner);
        EXPECT_EQ(People(), NotAmong(PeopleOf(made), PeopleOf(wanted), 7));
    }
}

// ---- At every moment ----------------------------------------------------------------------------

// What a directory holds, by device and inode: that is what stays the same under another name.
using Inodes = std::set<std::pair<dev_t, ino_t>>;

struct Moment {
    const char* name;
    int from;
    int to;
    Arguments arguments;  // "@" in front of one stands for the directory "from", "%" for "to"
    bool two_volumes = false;
};
void PrintTo(const Moment& moment, std::ostream* out) { *out << moment.name; }

class EveryMomentTest : public ::testing::TestWithParam<Moment> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_UNLESS_STOPPED();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(Here());
        MAVOEA_SKIP_WITHOUT_ACLS(Here());
        if (GetParam().two_volumes) MAVOEA_SKIP_WITHOUT_SECOND(SecondVolume());
    }

    // The tree "tree" with "file", both for the same people, and a file to be imported.
    void Make(const Travel& travel, const Kind& kind) const {
        const int type = GetParam().from;
        const std::string tree = travel.From("tree");
        MakeDir(tree);
        MakeObject(tree + "/file", kind);
        const std::string name = GetParam().name;
        const ObjectFiles files = {tree, "file"};
        if (name.starts_with("Upgrading")) {
            files.MakeLegacy("user.colour");
            Bytes resource = OneEntry(14, 400, 4, 741);
            WriteFile(files.folder() + "/MAVO:Resource", resource);
            for (const char* part : {"/user.colour", "/MAVO:Resource"}) {
                GiveRights(files.folder() + part, {kind.mode & 0600, false});
            }
        } else if (name.starts_with("Repairing")) {
            MakeDir(files.ea_dir());
            WriteFile(files.resource(), StreamImage{.attributes = {{"c", Ascii("blue")}}}.Build());
            GiveRights(files.resource(), {kind.mode & 0600, false});
        } else if (!name.starts_with("Making")) {
            MakeSidecars(type, tree, "file");
        }
        if (name.starts_with("Changing")) {
            for (const std::string& path : SidecarsOf(tree, "file")) {
                GiveRights(path, {kind.mode & 0666, kind.acl});
            }
        }
        GiveRights(tree, {kind.mode == 0600 ? mode_t{0700} : mode_t{0750}, kind.acl});
        WriteFile(travel.dir() / "incoming",
                  MacSidecar({{{"c", Ascii("blue")}}, Pattern(32, 1), Ascii("fork")}).bytes);
    }

    // Of what is made from an object: the copier's own has its mode only.
    static Rights WantedRights(const std::string& path) {
        Rights rights = RightsOf(path);
        if (!std::string(GetParam().name).ends_with("ForTheCopier")) return rights;
        return {geteuid(), getegid(), rights.mode, {}};
    }

    static std::vector<std::string> Paths(const Travel& travel) {
        std::vector<std::string> paths;
        for (const std::string& top : {travel.source(), travel.target()}) {
            for (const std::string& path : Tree(top)) paths.push_back(top + '/' + path);
        }
        return paths;
    }

    void Watch(const Kind& kind) const {
        SCOPED_TRACE(kind.Name());
        const Umask none(0);
        std::optional<SecondVolume> second;
        if (GetParam().two_volumes) second.emplace();
        const Travel travel(GetParam().from, GetParam().to, second ? second->path() : "");
        Make(travel, kind);
        if (HasFatalFailure()) return;
        const People file_people = PeopleOf(WantedRights(travel.From("tree/file")));
        const People tree_people = PeopleOf(WantedRights(travel.From("tree")));
        Inodes before;
        for (const std::string& path : Paths(travel)) {
            const struct stat info = StatusOf(path);
            before.insert({info.st_dev, info.st_ino});
        }
        Arguments arguments = GetParam().arguments;
        for (std::string& argument : arguments) {
            if (argument == "incoming") argument = travel.dir() / "incoming";
            if (argument.starts_with('@')) argument = travel.From(argument.substr(1));
            if (argument.starts_with('%')) argument = travel.To(argument.substr(1));
        }
        std::set<std::string> said;
        int made = 0;
        const auto look = [&](const std::string& when) {
            for (std::string path : Paths(travel)) {
                if (path.ends_with('/')) path.pop_back();
                struct stat info;
                if (lstat(path.c_str(), &info) != 0) continue;
                // An EA directory is everybody's, and what is in it is not.
                if (before.contains({info.st_dev, info.st_ino}) || path.ends_with("/@eaDir")) {
                    continue;
                }
                ++made;
                const bool directory = S_ISDIR(info.st_mode);
                const People more =
                    NotAmong(PeopleOf(RightsOf(path)), directory ? tree_people : file_people,
                             directory ? 7 : 6);
                if (!more.empty() && said.insert(path).second) {
                    ADD_FAILURE() << path << " is open to " << ::testing::PrintToString(more)
                                  << " before " << when;
                }
            }
        };
        const StoppedRun run = RunStopped(travel.WithVolumes(arguments), travel.dir().path(),
                                          [&](const FileCall& call) {
                                              look(::testing::PrintToString(call));
                                              return true;
                                          });
        look("the end");
        EXPECT_EQ(0, run.status) << run.err;
        // Nothing has to be made where something is changed.
        EXPECT_TRUE(made > 0 || std::string(GetParam().name).starts_with("Changing"));
    }
};

std::vector<Moment> AllMoments() {
    const std::string finder_info(64, '7');
    const std::vector<Moment> all = {
        {"MakingAnAppleDoubleFile", 0, 0, {"set", "@tree/file", "user.c", "blue"}},
        {"MakingAStream", 1, 1, {"set", "@tree/file", "user.c", "blue"}},
        {"MakingAResourceFileForAFork", 1, 1, {"set", "@tree/file", kFork, "fork"}},
        {"MakingAResourceFileForFinderInfo",
         2,
         2,
         {"set", "@tree/file", kFinderInfo, "--hex", finder_info}},
        {"MakingFilesFromAnImport", 1, 1, {"import", "incoming", "@tree/file"}},
        {"MakingAnAppleDoubleFileFromAnImport", 0, 0, {"import", "incoming", "@tree/file"}},
        {"ChangingAnAppleDoubleFile", 0, 0, {"set", "@tree/file", "user.c", "blue"}},
        {"ChangingAStream", 1, 1, {"set", "@tree/file", "user.c", "blue"}},
        {"Upgrading", 1, 1, {"upgrade", "-r", "@tree"}},
        {"Repairing", 1, 1, {"repair", "-r", "@tree"}},
        {"CopyingBetweenEaDirectories", 1, 1, {"cp", "-a", "@tree", "%"}},
        {"CopyingToAppleDoubleFiles", 1, 0, {"cp", "-a", "@tree", "%"}},
        {"CopyingToRecords", 0, 2, {"cp", "-a", "@tree", "%"}},
        {"CopyingBetweenAppleDoubleFiles", 0, 0, {"cp", "-a", "@tree", "%"}},
        {"CopyingToEaDirectoriesForTheCopier", 1, 1, {"cp", "-r", "@tree", "%"}},
        {"CopyingToAppleDoubleFilesForTheCopier", 1, 0, {"cp", "-r", "@tree", "%"}},
        {"CopyingToRecordsForTheCopier", 0, 2, {"cp", "-r", "@tree", "%"}},
        {"ConvertingToEaDirectories", 0, 1, {"convert", "-r", "--to", "1", "@tree", "%tree"}},
        {"ConvertingToAppleDoubleFiles", 2, 0, {"convert", "-r", "--to", "0", "@tree", "%tree"}},
        {"MovingToAppleDoubleFiles", 1, 0, {"mv", "@tree", "%"}},
        {"MovingToAnotherFileSystem", 1, 1, {"mv", "@tree", "%"}, true},
    };
    return Thinned(all);
}
INSTANTIATE_TEST_SUITE_P(AllMoments, EveryMomentTest, ::testing::ValuesIn(AllMoments()),
                         [](const auto& tested) { return tested.param.name; });

TEST_P(EveryMomentTest, WhatIsMadeIsOpenToNoMorePeopleThanInTheEnd) {
    for (const mode_t mode : {0600U, 0640U, 0664U}) {
        for (const bool acl : {false, true}) Watch({mode, acl});
    }
}

// ---- The lock -----------------------------------------------------------------------------------

// Where the permissions are the lock.
class LockedModeTest : public RightsTest {
 protected:
    std::string ModeAfter(const std::string& command) const {
        EXPECT_THAT(volume_.Run({command, volume_.object()}), Succeeded());
        return OctalModeOf(volume_.object());
    }

    Volume volume_{GetParam(), Here()};
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, LockedModeTest, ::testing::ValuesIn(Types({0, 7})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

// Promise: "Attribute word: Where the permissions"
TEST_P(LockedModeTest, UnlockingGivesBackWhatLockingTook) {
    for (const mode_t mode : {0600U, 0640U, 0644U, 0664U, 0755U, 0666U, 0620U, 0602U}) {
        SCOPED_TRACE(Octal(mode));
        GiveRights(volume_.object(), {mode, false});
        EXPECT_EQ(Octal(mode & ~0222U), ModeAfter("lock"));
        EXPECT_EQ(Octal(mode & ~0222U), ModeAfter("lock"));
        char taken[8] = {};
        EXPECT_EQ(4, getxattr(volume_.object().c_str(), "user.mavoea.writable", taken, 8));
        EXPECT_EQ(Octal(mode & 0222U), taken);
        EXPECT_EQ(Octal(mode), ModeAfter("unlock"));
        EXPECT_EQ(Octal(mode), ModeAfter("unlock"));
    }
}

TEST_P(LockedModeTest, TheNamedStateDoesTheSame) {
    for (const mode_t mode : {0600U, 0640U, 0664U}) {
        GiveRights(volume_.object(), {mode, false});
        EXPECT_THAT(volume_.Set("mavoea.locked", Ascii("1")), Succeeded());
        EXPECT_EQ(Octal(mode & ~0222U), OctalModeOf(volume_.object()));
        EXPECT_THAT(volume_.Set("mavoea.locked", Ascii("0")), Succeeded());
        EXPECT_EQ(Octal(mode), OctalModeOf(volume_.object()));
    }
}

TEST_P(LockedModeTest, OnlyTheOwnerMayWriteWhatNobodyCouldBefore) {
    for (const mode_t mode : {0444U, 0400U, 0440U, 0555U}) {
        SCOPED_TRACE(Octal(mode));
        GiveRights(volume_.object(), {mode, false});
        EXPECT_EQ(Octal(mode | 0200U), ModeAfter("unlock"));
        GiveRights(volume_.object(), {mode, false});
        EXPECT_EQ(Octal(mode), ModeAfter("lock"));
        EXPECT_EQ(Octal(mode | 0200U), ModeAfter("unlock"));
    }
}

TEST_P(LockedModeTest, WhatAnEarlierLockTookIsForgotten) {
    GiveRights(volume_.object(), {0666, false});
    EXPECT_EQ(Octal(0444), ModeAfter("lock"));
    ASSERT_EQ(0, chmod(volume_.object().c_str(), 0600));  // somebody else has unlocked it
    EXPECT_EQ(Octal(0600), ModeAfter("unlock"));
    EXPECT_EQ(Octal(0400), ModeAfter("lock"));
    EXPECT_EQ(Octal(0600), ModeAfter("unlock"));

    GiveRights(volume_.object(), {0666, false});
    EXPECT_EQ(Octal(0444), ModeAfter("lock"));
    ASSERT_EQ(0, chmod(volume_.object().c_str(), 0640));
    EXPECT_EQ(Octal(0440), ModeAfter("lock"));
    EXPECT_EQ(Octal(0640), ModeAfter("unlock"));
    // Nobody could write it when it was locked a second time.
    ASSERT_EQ(0, chmod(volume_.object().c_str(), 0400));
    EXPECT_EQ(Octal(0600), ModeAfter("unlock"));
}

TEST_P(LockedModeTest, TheOwnerLocksAndUnlocksHisOwn) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    for (const mode_t mode : {0600U, 0640U, 0664U}) {
        GiveRights(volume_.object(), {mode, false});
        AsUser(kOwner, Root::kGivenUp, [&] {
            EXPECT_EQ(Octal(mode & ~0222U), ModeAfter("lock"));
            EXPECT_EQ(Octal(mode), ModeAfter("unlock"));
        });
    }
}

TEST_P(LockedModeTest, AnAclIsWhatItWasAfterwards) {
    for (const mode_t mode : {0600U, 0640U, 0664U}) {
        GiveRights(volume_.object(), {mode, true});
        const Rights before = RightsOf(volume_.object());
        EXPECT_EQ(Octal(mode & ~0222U), ModeAfter("lock"));
        EXPECT_EQ(Octal(mode), ModeAfter("unlock"));
        EXPECT_EQ(before, RightsOf(volume_.object()));
    }
}

TEST_P(LockedModeTest, DirectoriesGetTheirsBackAsWell) {
    const std::string directory = volume_.path() + "/directory";
    MakeDir(directory);
    for (const mode_t mode : {0700U, 0750U, 0775U, 0777U}) {
        GiveRights(directory, {mode, false});
        EXPECT_THAT(volume_.Run({"lock", directory}), Succeeded());
        EXPECT_EQ(Octal(mode & ~0222U), OctalModeOf(directory));
        EXPECT_THAT(volume_.Run({"unlock", directory}), Succeeded());
        EXPECT_EQ(Octal(mode), OctalModeOf(directory));
    }
}

// ---- What an upgrade does to an object ----------------------------------------------------------

class UpgradedModeTest : public RightsTest {
 protected:
    // The mode of an object of that mode whose legacy resource file had those AFP attributes.
    static std::string ModeAfter(int type, mode_t mode, std::uint32_t afp_attributes) {
        const Volume volume(type, Here());
        GiveRights(volume.object(), {mode, false});
        Bytes resource = OneEntry(14, 400, 4, 741);
        PutU16(resource, 402, afp_attributes);
        ObjectFiles{volume.path(), "file.txt"}.MakeFolder();
        WriteFile(volume.path() + "/@eaDir/file.txt/MAVO:Resource", resource);
        const ToolResult result = volume.Run({"upgrade", volume.object()});
        EXPECT_EQ(0, result.status) << result.err;
        EXPECT_TRUE(Exists(volume.resource()));
        return OctalModeOf(volume.object());
    }
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, UpgradedModeTest, ::testing::ValuesIn(Types({1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(UpgradedModeTest, AnObjectThatIsNotReadOnlyKeepsItsMode) {
    for (const mode_t mode : {0600U, 0640U, 0644U, 0664U, 0755U, 0444U}) {
        EXPECT_EQ(Octal(mode), ModeAfter(GetParam(), mode, 0x0180)) << mode;
        EXPECT_EQ(Octal(mode), ModeAfter(GetParam(), mode, 0)) << mode;
    }
}

TEST_P(UpgradedModeTest, NobodyWritesAnObjectThatIsReadOnly) {
    for (const mode_t mode : {0600U, 0640U, 0644U, 0664U, 0755U, 0444U}) {
        EXPECT_EQ(Octal(mode & ~0222U), ModeAfter(GetParam(), mode, 0x0020)) << mode;
    }
}

}  // namespace
}  // namespace mavoea::test

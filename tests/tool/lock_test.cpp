// The Mac locked state through the tool, on every kind of volume.

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <memory>

#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

const std::string kLocked = "mavoea.locked";
const char* const kRecordAttribute = "user.netatalk.Metadata";

// Where the AFP attribute word is in AttributeRecord().
constexpr std::size_t kAfpAttributesAt = 372;

Bytes StoredRecord(const std::string& path) {
    Bytes block(2048);
    const ssize_t size = getxattr(path.c_str(), kRecordAttribute, block.data(), block.size());
    block.resize(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
    return block;
}

bool StoreRecord(const std::string& path, const Bytes& block) {
    return setxattr(path.c_str(), kRecordAttribute, block.data(), block.size(), 0) == 0;
}

class LockTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume_.path());
        ASSERT_EQ(0, chmod(volume_.object().c_str(), 0644));
    }

    bool InPermissions() const { return GetParam() == 0 || GetParam() == 5 || GetParam() == 7; }

    Volume volume_{GetParam()};
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, LockTest,
                         ::testing::ValuesIn(Types({0, 1, 2, 3, 5, 6, 7, 10})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(LockTest, LockingAndUnlockingAreSeenUnderTheNameOfTheState) {
    EXPECT_EQ("0", volume_.Get(kLocked).out);
    EXPECT_EQ("", volume_.List().out);

    EXPECT_THAT(volume_.Run({"lock", volume_.object()}), Succeeded());
    EXPECT_EQ("1", volume_.Get(kLocked).out);
    EXPECT_THAT(volume_.List().out, HasSubstr(kLocked + "\n"));
    EXPECT_THAT(volume_.Run({"list", "-l", volume_.object()}).out,
                HasSubstr("         1  locked state   " + kLocked));
    EXPECT_EQ(InPermissions() ? 0444 : 0644, ModeOf(volume_.object()));

    EXPECT_THAT(volume_.Run({"unlock", volume_.object()}), Succeeded());
    EXPECT_EQ("0", volume_.Get(kLocked).out);
    EXPECT_EQ(std::string::npos, volume_.List().out.find(kLocked));
    EXPECT_EQ(0644, ModeOf(volume_.object()));
}

TEST_P(LockTest, TheStateIsSetAndRemovedLikeAnAttribute) {
    EXPECT_EQ(1, volume_.Remove(kLocked).status);
    EXPECT_THAT(volume_.Set(kLocked, Ascii("1")), Succeeded());
    EXPECT_THAT(volume_.Set(kLocked, Ascii("1")), Succeeded());
    EXPECT_EQ("1", volume_.Get(kLocked).out);
    EXPECT_THAT(volume_.Set(kLocked, Ascii("0")), Succeeded());
    EXPECT_EQ("0", volume_.Get(kLocked).out);
    EXPECT_THAT(volume_.Set(kLocked, Ascii("1")), Succeeded());
    EXPECT_THAT(volume_.Remove(kLocked), Succeeded());
    EXPECT_EQ("0", volume_.Get(kLocked).out);
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume_.path()));
}

TEST_P(LockTest, AnythingButZeroAndOneIsRefused) {
    for (const char* value : {"", "2", "yes", "10", "1\n"}) {
        EXPECT_THAT(volume_.Set(kLocked, Ascii(value)),
                    Failed(2, volume_.object() +
                                  ": the locked state is 0 or 1; give it without a line's end, or "
                                  "use mavoea lock and mavoea unlock"));
    }
    EXPECT_EQ("0", volume_.Get(kLocked).out);
}

TEST_P(LockTest, EveryPathIsDoneThoughOneFails) {
    const std::string other = volume_.path() + "/other.txt";
    const std::string missing = volume_.path() + "/missing";
    WriteFile(other, {});
    const ToolResult result = volume_.Run({"--json", "lock", volume_.object(), missing, other});
    EXPECT_EQ(1, result.status);
    EXPECT_EQ("mavoea: " + missing + ": No such file or directory; check the path\n", result.err);
    ASSERT_EQ(2U, result.json().size());
    EXPECT_EQ(volume_.object(), result.json()[0]["path"]);
    EXPECT_EQ(true, result.json()[1]["locked"]);
    EXPECT_EQ("1", volume_.Run({"get", other, kLocked}).out);
}

TEST_P(LockTest, ADirectoryIsLockedAsWell) {
    const std::string directory = volume_.path() + "/directory";
    ASSERT_EQ(0, mkdir(directory.c_str(), 0755));
    EXPECT_THAT(volume_.Run({"lock", directory}), Succeeded());
    EXPECT_EQ(kLocked + "\n", volume_.Run({"list", directory}).out);
    EXPECT_THAT(volume_.Run({"unlock", directory}), Succeeded());
    EXPECT_EQ("", volume_.Run({"list", directory}).out);
}

TEST(LockElsewhereTest, VolumesThatKeepNoStateSaySo) {
    for (const int type : {4, 8, 9, 11, 12}) {
        const Volume volume(type);
        for (const char* command : {"lock", "unlock"}) {
            const ToolResult result = volume.Run({command, volume.object()});
            EXPECT_EQ(2, result.status);
            EXPECT_THAT(result.err,
                        HasSubstr("volumes of type " + std::to_string(type) + " keep no metadata"));
        }
    }
}

TEST(LockElsewhereTest, WhatCannotKeepTheStateIsToldSo) {
    const Volume volume(1);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    const std::string pipe = volume.path() + "/pipe";
    ASSERT_EQ(0, mkfifo(pipe.c_str(), 0644));
    EXPECT_THAT(volume.Run({"lock", pipe}),
                Failed(2, pipe + ": its file system cannot keep the locked state; the locked state "
                                 "takes a file system with attributes of users, and an object that "
                                 "may have them"));
    EXPECT_THAT(volume.Run({"unlock", pipe}), Succeeded());
}

// ---- The AFP attributes of a record -------------------------------------------------------------

TEST(LockRecordTest, EachAfpAttributeThatLocksIsSeenAndGoesAloneInTheAttribute) {
    const Volume volume(2);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    for (const std::uint32_t bit : {0x0020U, 0x0080U, 0x0100U, 0x01A0U}) {
        Bytes record = AttributeRecord();
        PutU16(record, kAfpAttributesAt, bit | 0x0441);
        ASSERT_TRUE(StoreRecord(volume.object(), record));
        EXPECT_EQ("1", volume.Get(kLocked).out);
        ASSERT_THAT(volume.Run({"unlock", volume.object()}), Succeeded());
        EXPECT_EQ("0", volume.Get(kLocked).out);
        PutU16(record, kAfpAttributesAt, 0x0441);
        EXPECT_EQ(record, StoredRecord(volume.object()));
    }
}

TEST(LockRecordTest, TheSameHoldsForTheHeadOfAResourceFile) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const Volume volume(1);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    ASSERT_THAT(volume.Set("com.apple.ResourceFork", Ascii("make the directory")), Succeeded());
    Bytes file = OneEntry(14, 400, 4, 741) + Pattern(100);
    PutU16(file, 402, 0x0121);
    WriteFile(volume.resource(), file);
    EXPECT_EQ("1", volume.Get(kLocked).out);
    ASSERT_THAT(volume.Run({"unlock", volume.object()}), Succeeded());
    PutU16(file, 402, 0x0001);
    EXPECT_EQ(file, ReadFile(volume.resource()));
    EXPECT_EQ("0", volume.Get(kLocked).out);
}

TEST(LockRecordTest, ManyFilesTakeNoMoreDescriptorsThanOne) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const Volume volume(1);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    ASSERT_THAT(volume.Set("com.apple.ResourceFork", Ascii("make the directory")), Succeeded());
    std::string command =
        "ulimit -n 16; " + Tested().Command() + " --volume " + Quoted(volume.path()) + "=1 unlock";
    for (int i = 0; i < 40; ++i) {
        const std::string name = "f" + std::to_string(i);
        WriteFile(volume.path() + "/" + name, {});
        Bytes file = OneEntry(14, 400, 4, 741);
        PutU16(file, 402, 0x0020);
        WriteFile(volume.path() + "/@eaDir/" + name + "@MavoResource", file);
        command += " " + Quoted(volume.path() + "/" + name);
    }
    EXPECT_EQ(0, system(command.c_str()));
}

TEST(LockRecordTest, ADamagedRecordIsToldBeforeAnythingChanges) {
    const Volume volume(2);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    Bytes record = AttributeRecord();
    record.pop_back();
    ASSERT_TRUE(StoreRecord(volume.object(), record));
    const std::string message = volume.object() +
                                ": its netatalk record is damaged; look at it with: mavoea dump "
                                "--record PATH";
    EXPECT_THAT(volume.Run({"lock", volume.object()}), Failed(2, message));
    EXPECT_THAT(volume.Run({"unlock", volume.object()}), Failed(2, message));
    EXPECT_THAT(volume.Get(kLocked), Failed(2, message));
    EXPECT_EQ(record, StoredRecord(volume.object()));
    ASSERT_EQ(0, removexattr(volume.object().c_str(), kRecordAttribute));
    EXPECT_EQ("0", volume.Get(kLocked).out);
}

}  // namespace
}  // namespace mavoea::test

// The Mac locked state of a file: how each kind of volume tells it, how each is told, and who is
// asked and told when a file goes from one to another.

#include "adouble/ea_copy_lock.h"

#include <errno.h>
#include <gmock/gmock.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr char kUnit[] = "ea_copy_lock";
constexpr char kAttribute[] = "user.netatalk.Metadata";

// Where a file's AFP attribute word is, in the two records that the tests use.
constexpr std::size_t kAttributeWordAt = 372;
constexpr std::size_t kResourceWordAt = 102;

Bytes AttributeRecordWithWord(std::uint16_t word) {
    Bytes record = AttributeRecord();
    PutU16(record, kAttributeWordAt, word);
    return record;
}

// A record of one entry at the head of a resource file, and something behind it.
Bytes ResourceFileWithWord(std::uint16_t word) {
    Bytes file = OneEntry(14, kResourceWordAt - 2, 4) + Pattern(300, 0x70);
    PutU16(file, kResourceWordAt, word);
    return file;
}

// A file with everything that can tell a locked state.
struct LockedFile {
    LockedFile(const std::string& parent, const std::string& name)
        : path(parent + "/" + name), resource(parent + "/@eaDir/" + name + "@MavoResource") {
        mkdir(parent.c_str(), 0777);
        WriteFile(path, Ascii("data"));
    }

    void SetAttribute(const Bytes& value) const {
        const int mode = ModeOf(path);
        ASSERT_EQ(0, chmod(path.c_str(), 0644));
        ASSERT_EQ(0, setxattr(path.c_str(), kAttribute, value.data(), value.size(), 0));
        ASSERT_EQ(0, chmod(path.c_str(), static_cast<mode_t>(mode)));
    }
    Bytes Attribute() const {
        Bytes value(2000);
        const ssize_t size = getxattr(path.c_str(), kAttribute, value.data(), value.size());
        if (size < 0) return Ascii(errno == ENODATA ? "(none)" : "(not read)");
        value.resize(static_cast<std::size_t>(size));
        return value;
    }
    void FillResourceFile(const Bytes& bytes) const {
        mkdir((path.substr(0, path.rfind('/')) + "/@eaDir").c_str(), 0777);
        WriteFile(resource, bytes);
    }
    void SetMode(mode_t mode) const { ASSERT_EQ(0, chmod(path.c_str(), mode)); }
    int Mode() const { return ModeOf(path); }

    std::string path;
    std::string resource;
};

// The platform's answer whose attribute word is `word`.
auto Word(std::uint32_t word) {
    return [word](const std::string&, unsigned char info[128]) {
        memcpy(info + 116, &word, sizeof word);
        return 0;
    };
}

class CopyLockTest : public ::testing::Test {
 protected:
    CopyLockTest() : source_(dir_ / "from", "a"), target_(dir_ / "to", "b") {
        ResetKernel();
        ResetPlatform();
        Hooks().command = [](const char*, int) { return 0; };
    }
    ~CopyLockTest() override {
        ExpectNothingReported();
        ResetKernel();
        ResetPlatform();
    }

    int Copy(int from, int to) const {
        return MAVOEACopyLock(source_.path.c_str(), target_.path.c_str(), from, to);
    }
    static std::vector<std::string> TakeCommands() {
        std::vector<std::string> calls = TakeCalls();
        std::erase_if(calls, [](const std::string& call) { return !call.starts_with("command("); });
        return calls;
    }
    std::string Locks(const LockedFile& file) const { return "command(" + file.path + ", 522)"; }
    std::string Unlocks(const LockedFile& file) const { return "command(" + file.path + ", 521)"; }

    static void ExpectBadArgument() {
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, kUnit)));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_THAT(TakeCalls(), IsEmpty());
        EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    }

    TempDir dir_;
    const LockedFile source_;
    const LockedFile target_;
    const std::string missing_ = dir_ / "missing";
};

// ---- Write permissions -------------------------------------------------------------------------

TEST_F(CopyLockTest, AFileThatNobodyMayWriteIsLocked) {
    for (mode_t mode = 0; mode <= 0777; ++mode) {
        source_.SetMode(mode);
        ASSERT_EQ((mode & 0222) == 0 ? 1 : 0, EAModeLockGet(source_.path.c_str())) << mode;
    }
    for (const mode_t mode : {04555u, 02555u, 01555u}) {
        Hooks().stat = [mode](const char*, struct stat* info) {
            *info = {};
            info->st_mode = S_IFREG | mode;
            return 0;
        };
        EXPECT_EQ(1, EAModeLockGet(source_.path.c_str()));
    }
}

TEST_F(CopyLockTest, LockingTakesTheWritePermissionsAndUnlockingGivesAllThree) {
    struct Case {
        mode_t before;
        int lock;
        int after;
    };
    constexpr Case kCases[] = {
        {0644, 1, 0444},   {0444, 1, 0444},   {0777, 1, 0555}, {0222, 1, 0000},
        {04755, 1, 04555}, {0644, 0, 0666},   {0444, 0, 0666}, {0555, 0, 0777},
        {0000, 0, 0222},   {01500, 0, 01722}, {0444, 2, 0666}, {0444, -1, 0666},
    };
    for (const Case& one : kCases) {
        SCOPED_TRACE(testing::Message() << std::oct << one.before << std::dec << " " << one.lock);
        target_.SetMode(one.before);
        EXPECT_EQ(0, EAModeLockSet(target_.path.c_str(), one.lock));
        struct stat info;
        ASSERT_EQ(0, stat(target_.path.c_str(), &info));
        EXPECT_EQ(one.after, static_cast<int>(info.st_mode & 07777));
    }
    EXPECT_THAT(TakeCommands(), IsEmpty());
}

TEST_F(CopyLockTest, WritePermissionsOfAMissingFileCannotBeToldOrSet) {
    EXPECT_EQ(-1, EAModeLockGet(missing_.c_str()));
    EXPECT_EQ(-1, EAModeLockSet(missing_.c_str(), 1));
    EXPECT_EQ(-1, EAModeLockSet(missing_.c_str(), 0));
    ExpectNothingReported();
    EXPECT_FALSE(Exists(missing_));
}

TEST_F(CopyLockTest, AFailedChmodIsRecorded) {
    for (const int lock : {1, 0}) {
        const FailCall fault("chmod", EPERM);
        EXPECT_EQ(-1, EAModeLockSet(target_.path.c_str(), lock));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, kUnit)));
    }
}

// ---- The platform's flag -----------------------------------------------------------------------

TEST_F(CopyLockTest, TheFlagIsBit5OfTheAttributeWord) {
    for (int bit = 0; bit < 32; ++bit) {
        const std::uint32_t word = std::uint32_t{1} << bit;
        Platform().file_stat = Word(word);
        EXPECT_EQ(bit == 5 ? 1 : 0, EAPlatformLockGet(source_.path.c_str())) << bit;
        Platform().file_stat = Word(~word);
        EXPECT_EQ(bit == 5 ? 0 : 1, EAPlatformLockGet(source_.path.c_str())) << bit;
    }
}

TEST_F(CopyLockTest, TheFlagIsInNoOtherByteOfTheAnswer) {
    Platform().file_stat = [](const std::string&, unsigned char info[128]) {
        memset(info, 0xFF, 128);
        memset(info + 116, 0, 4);
        return 0;
    };
    EXPECT_EQ(0, EAPlatformLockGet(source_.path.c_str()));
}

TEST_F(CopyLockTest, ThePlatformIsAskedOnceWithOption3) {
    EXPECT_EQ(0, EAPlatformLockGet(source_.path.c_str()));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MLIBCFileStat(" + source_.path + ", 3)"));
}

TEST_F(CopyLockTest, AFlagThatThePlatformCannotTellIsAFailureWithoutARecord) {
    Platform().file_stat = [](const std::string&, unsigned char info[128]) {
        memset(info, 0xFF, 128);
        return -1;
    };
    EXPECT_EQ(-1, EAPlatformLockGet(source_.path.c_str()));
    ExpectNothingReported();
}

TEST_F(CopyLockTest, SettingTheFlagIsTheSystemCallWith522OrElse521) {
    for (const int lock : {1, 0, 2, -1, 522}) {
        SCOPED_TRACE(lock);
        std::vector<std::pair<std::string, int>> calls;
        Hooks().command = [&calls](const char* path, int command) {
            calls.emplace_back(path, command);
            return 0;
        };
        EXPECT_EQ(0, EASetLockFlag(target_.path.c_str(), lock));
        EXPECT_THAT(calls, ElementsAre(std::pair(target_.path, lock == 1 ? 522 : 521)));
    }
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

TEST_F(CopyLockTest, WhatTheSystemCallReturnsIsIgnored) {
    for (const int result : {-1, 1, 522}) {
        Hooks().command = [result](const char*, int) {
            errno = EPERM;
            return result;
        };
        EXPECT_EQ(0, EASetLockFlag(target_.path.c_str(), 1));
        EXPECT_EQ(0, EASetLockFlag(target_.path.c_str(), 0));
    }
    const FailCall fault("command", ENOSYS);
    EXPECT_EQ(0, EASetLockFlag(missing_.c_str(), 1));
}

// ---- The record --------------------------------------------------------------------------------

// A reader of records that answers to order.
EAAdouble given;
int given_result;
std::string asked;
bool was_zeroed;
int GivenRecord(const char* path, EAAdouble* ad) {
    const EAAdouble zero = {};
    was_zeroed = memcmp(&zero, ad, sizeof zero) == 0;
    asked = path;
    *ad = given;
    return given_result;
}

class RecordLockTest : public CopyLockTest {
 protected:
    RecordLockTest() {
        given = {};
        given_result = 0;
    }
    int Get() const { return EAAdoubleLockGet(source_.path.c_str(), GivenRecord); }
};

// Promise: "AppleDouble: Of the ids"
TEST_F(RecordLockTest, AnyOfThreeAfpAttributesLocks) {
    given.entries[14] = {.offset = 370, .length = 4};
    for (int bit = 0; bit < 16; ++bit) {
        SCOPED_TRACE(bit);
        PutU16(given.data, kAttributeWordAt, 1u << bit);
        EXPECT_EQ(bit == 5 || bit == 7 || bit == 8 ? 1 : 0, Get());
    }
    PutU16(given.data, kAttributeWordAt, 0x01A0);
    EXPECT_EQ(1, Get());
    PutU16(given.data, kAttributeWordAt, 0xFE5F);
    EXPECT_EQ(0, Get());
    // The entry's first two bytes are no attributes.
    PutU32(given.data, 370, 0xFFFF0000);
    EXPECT_EQ(0, Get());
}

TEST_F(RecordLockTest, TheReaderGetsThePathAndAZeroedRecord) {
    EXPECT_EQ(0, Get());
    EXPECT_EQ(source_.path, asked);
    EXPECT_TRUE(was_zeroed);
}

TEST_F(RecordLockTest, WithoutARecordNothingIsLockedAndAFailureStaysOne) {
    given.entries[14] = {.offset = 370, .length = 4};
    PutU16(given.data, kAttributeWordAt, 0x01A0);
    given_result = 1;
    EXPECT_EQ(0, Get());
    given_result = -1;
    EXPECT_EQ(-1, Get());
}

// Promise: "Netatalk record: Finder info or AFP"
TEST_F(RecordLockTest, AFileInfoEntryThatIsAbsentOrLiesDoesNotLock) {
    memset(given.data, 0xFF, sizeof given.data);
    given.data[24] = 0;
    given.data[25] = 8;  // descriptors, which end at 122
    struct Case {
        std::int64_t offset;
        std::uint32_t length;
        int expected;
    };
    constexpr Case kCases[] = {
        {0, 4, 0},
        {0, 0, 0},
        {370, 0, 0},
        {370, 3, 0},
        {1021, 4, 0},
        {1021, 3, 0},
        {1023, 4, 0},
        {1024, 4, 0},
        {-1, 4, 0},
        {-4, 4, 0},
        {INT64_MAX, 4, 0},
        {INT64_MIN, 4, 0},
        {4294967296 + 370, 4, 0},
        {1, 4, 0},
        {25, 4, 0},
        {121, 4, 0},
        {122, 4, 1},
        {1020, 4, 1},
        {370, 4, 1},
        {370, 0xFFFFFFFF, 1},
    };
    for (const Case& one : kCases) {
        SCOPED_TRACE(testing::Message() << one.offset << ", " << one.length);
        given.entries[14] = {.offset = one.offset, .length = one.length};
        EXPECT_EQ(one.expected, Get());
    }
}

TEST_F(RecordLockTest, NoOtherEntryIsTakenForTheFileInfo) {
    memset(given.data, 0xFF, sizeof given.data);
    for (int slot = 0; slot < 20; ++slot) {
        if (slot != 14) given.entries[slot] = {.offset = 370, .length = 4};
    }
    EXPECT_EQ(0, Get());
}

// ---- Flag and record together ------------------------------------------------------------------

// The two kinds of volume that keep flag and record; they differ in where the record is.
struct RecordVolume {
    LockGetter get;
    LockSetter set;
    bool in_attribute;

    void Store(const LockedFile& file, std::uint16_t word) const {
        if (in_attribute) {
            file.SetAttribute(AttributeRecordWithWord(word));
        } else {
            file.FillResourceFile(ResourceFileWithWord(word));
        }
    }
    Bytes Stored(const LockedFile& file) const {
        return in_attribute ? file.Attribute() : ReadFile(file.resource);
    }
    Bytes Expected(std::uint16_t word) const {
        return in_attribute ? AttributeRecordWithWord(word) : ResourceFileWithWord(word);
    }
};

constexpr RecordVolume kRecordVolumes[] = {{EAEADirFSLockGet, EAEADirFSLockSet, false},
                                           {EAFileEAFSLockGet, EAFileEAFSLockSet, true}};

class RecordVolumeTest : public CopyLockTest, public ::testing::WithParamInterface<RecordVolume> {
 protected:
    const RecordVolume& volume_ = GetParam();
};

TEST_P(RecordVolumeTest, ALockedFlagIsEnough) {
    volume_.Store(source_, 0);
    Platform().file_stat = Word(0x20);
    EXPECT_EQ(1, volume_.get(source_.path.c_str()));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MLIBCFileStat(" + source_.path + ", 3)"));
    EXPECT_THAT(TakeCallNames(), IsEmpty());  // The record is not looked at then.
}

TEST_P(RecordVolumeTest, WithoutTheFlagTheRecordTells) {
    for (const int word : {0x0020, 0x0080, 0x0100, 0x01A0}) {
        volume_.Store(source_, static_cast<std::uint16_t>(word));
        EXPECT_EQ(1, volume_.get(source_.path.c_str())) << word;
    }
    volume_.Store(source_, 0xFE5F);
    EXPECT_EQ(0, volume_.get(source_.path.c_str()));
}

TEST_P(RecordVolumeTest, TheOtherVolumesRecordIsNotLookedAt) {
    for (const RecordVolume& other : kRecordVolumes) {
        if (other.in_attribute != volume_.in_attribute) other.Store(source_, 0x01A0);
    }
    EXPECT_EQ(0, volume_.get(source_.path.c_str()));
}

TEST_P(RecordVolumeTest, WithoutFlagAndRecordNothingIsLocked) {
    EXPECT_EQ(0, volume_.get(source_.path.c_str()));
    ExpectNothingReported();
}

TEST_P(RecordVolumeTest, AFlagThatCannotBeToldFailsTheGetter) {
    volume_.Store(source_, 0x01A0);
    Platform().file_stat = [](const std::string&, unsigned char*) { return -1; };
    EXPECT_EQ(-1, volume_.get(source_.path.c_str()));
    ExpectNothingReported();
}

TEST_P(RecordVolumeTest, ABadRecordFailsTheGetterWithTheReadersCodes) {
    if (volume_.in_attribute) {
        source_.SetAttribute(Repeat(1, 402));
    } else {
        source_.FillResourceFile(Repeat(1, 741));
    }
    EXPECT_EQ(-1, volume_.get(source_.path.c_str()));
    EXPECT_EQ(0xA00, TakeRecords().front().code);
    EXPECT_EQ(2u, TakeLog().size());
}

TEST_P(RecordVolumeTest, LockingSetsTwoBitsOfTheFirstAttributeByteAndUnlockingClearsThem) {
    struct Case {
        int before;
        int lock;
        int after;
    };
    constexpr Case kCases[] = {
        {0x0000, 1, 0xA000}, {0x5F20, 1, 0xFF20},  {0xFFFF, 1, 0xFFFF}, {0x2000, 1, 0xA000},
        {0xA000, 0, 0x0000}, {0xFFFF, 0, 0x5FFF},  {0x0000, 0, 0x0000}, {0x20A0, 0, 0x00A0},
        {0xA000, 2, 0x0000}, {0xA000, -1, 0x0000},
    };
    for (const Case& one : kCases) {
        SCOPED_TRACE(testing::Message() << std::hex << one.before << " " << one.lock);
        const long before = OpenDescriptors();
        volume_.Store(target_, static_cast<std::uint16_t>(one.before));
        TakeCalls();
        EXPECT_EQ(0, volume_.set(target_.path.c_str(), one.lock));
        EXPECT_EQ(volume_.Expected(static_cast<std::uint16_t>(one.after)), volume_.Stored(target_));
        EXPECT_THAT(TakeCommands(), ElementsAre(one.lock == 1 ? Locks(target_) : Unlocks(target_)));
        // The flush of a resource file's record keeps its descriptor.
        EXPECT_EQ(before + (volume_.in_attribute ? 0 : 1), OpenDescriptors());
    }
}

TEST_P(RecordVolumeTest, TheBlockIsStoredInItsWholeLengthEvenWhenNothingChanged) {
    volume_.Store(target_, 0xA000);
    EXPECT_EQ(0, volume_.set(target_.path.c_str(), 1));
    const auto calls = TakeCalls();
    EXPECT_EQ(volume_.in_attribute
                  ? "setxattr(" + target_.path + ", user.netatalk.Metadata, 402, 0)"
                  : "pwrite(741, 0)",
              calls.back());
}

TEST_P(RecordVolumeTest, WithoutARecordOnlyTheFlagIsSet) {
    for (const int lock : {1, 0}) {
        EXPECT_EQ(0, volume_.set(target_.path.c_str(), lock));
        EXPECT_THAT(TakeCommands(), ElementsAre(lock == 1 ? Locks(target_) : Unlocks(target_)));
        EXPECT_EQ(Ascii("(none)"), target_.Attribute());
        EXPECT_FALSE(Exists(target_.resource));
    }
    EXPECT_EQ(0644, target_.Mode() & 0644);
}

TEST_P(RecordVolumeTest, ALockThatWasSetInTheRecordIsSeenThroughTheFlagOnly) {
    volume_.Store(target_, 0);
    EXPECT_EQ(0, volume_.set(target_.path.c_str(), 1));
    EXPECT_EQ(0, volume_.get(target_.path.c_str()));
    Platform().file_stat = Word(0x20);
    EXPECT_EQ(1, volume_.get(target_.path.c_str()));
    // And what the record says to the getter, the setter does not take away.
    Platform().file_stat = Word(0);
    volume_.Store(target_, 0x01A0);
    EXPECT_EQ(0, volume_.set(target_.path.c_str(), 0));
    EXPECT_EQ(volume_.Expected(0x01A0), volume_.Stored(target_));
    EXPECT_EQ(1, volume_.get(target_.path.c_str()));
}

TEST_P(RecordVolumeTest, AFlagThatCannotBeSetDoesNotKeepTheRecordFromIt) {
    volume_.Store(target_, 0);
    const FailCall fault("command", EPERM);
    EXPECT_EQ(0, volume_.set(target_.path.c_str(), 1));
    EXPECT_EQ(volume_.Expected(0xA000), volume_.Stored(target_));
}

TEST_P(RecordVolumeTest, ARecordThatCannotBeReadFailsTheSetterAfterTheFlag) {
    volume_.Store(target_, 0);
    const FailCall fault(volume_.in_attribute ? "getxattr" : "open", EIO);
    EXPECT_EQ(-1, volume_.set(target_.path.c_str(), 1));
    EXPECT_THAT(TakeRecords(),
                ElementsAre(volume_.in_attribute ? RecordOf(0xA00, "ea_fileafs_adouble_read")
                                                 : RecordOf(0x900, "ea_eadirfs_adouble_read")));
    EXPECT_EQ(1u, TakeLog().size());
    EXPECT_THAT(TakeCommands(), ElementsAre(Locks(target_)));  // and it is not undone
    EXPECT_EQ(volume_.Expected(0), volume_.Stored(target_));
}

TEST_P(RecordVolumeTest, ARecordThatCannotBeStoredFailsTheSetterAfterTheFlag) {
    volume_.Store(target_, 0);
    const std::string call = volume_.in_attribute ? "setxattr" : "pwrite";
    for (const auto& [error, code] : {std::pair{EPERM, 0x300}, {ENOSPC, 0xB00}}) {
        const FailCall fault(call, error);
        EXPECT_EQ(-1, volume_.set(target_.path.c_str(), 1));
        EXPECT_THAT(TakeRecords(),
                    ElementsAre(volume_.in_attribute ? RecordOf(code, "ea_fileeafs_flush")
                                                     : RecordOf(0xB00, "ea_eadirfs_flush")));
        EXPECT_EQ(volume_.in_attribute ? 0u : 1u, TakeLog().size());
        EXPECT_THAT(TakeCommands(), ElementsAre(Locks(target_)));
    }
    EXPECT_EQ(volume_.Expected(0), volume_.Stored(target_));
}

TEST_P(RecordVolumeTest, AFileInfoEntryThatLiesIsLeftAlone) {
    for (const auto& [offset, length] :
         {std::pair{100u, 3u}, {100u, 0u}, {1021u, 3u}, {1023u, 1u}, {1023u, 0u}}) {
        SCOPED_TRACE(testing::Message() << offset << ", " << length);
        const std::size_t descriptor = volume_.in_attribute ? 26 + 3 * 12 : 26;
        Bytes block = volume_.Expected(0x01A0);
        PutU32(block, descriptor + 4, offset);
        PutU32(block, descriptor + 8, length);
        if (volume_.in_attribute) {
            target_.SetAttribute(block);
        } else {
            target_.FillResourceFile(block);
        }
        EXPECT_EQ(0, volume_.get(target_.path.c_str()));
        for (const int lock : {1, 0}) {
            EXPECT_EQ(0, volume_.set(target_.path.c_str(), lock));
            EXPECT_EQ(block, volume_.Stored(target_));
        }
    }
}

TEST_P(RecordVolumeTest, AFileInfoEntryBehindTheBlockIsReadAsZerosAndNotStored) {
    const std::size_t descriptor = volume_.in_attribute ? 26 + 3 * 12 : 26;
    Bytes block = volume_.Expected(0x01A0);
    PutU32(block, descriptor + 4, 1020);
    if (volume_.in_attribute) {
        target_.SetAttribute(block);
    } else {
        target_.FillResourceFile(block);
    }
    EXPECT_EQ(0, volume_.get(target_.path.c_str()));
    EXPECT_EQ(0, volume_.set(target_.path.c_str(), 1));
    EXPECT_EQ(block, volume_.Stored(target_));
}

INSTANTIATE_TEST_SUITE_P(Volumes, RecordVolumeTest, ::testing::ValuesIn(kRecordVolumes),
                         [](const auto& test) {
                             return test.param.in_attribute ? "FileEA" : "EADir";
                         });

TEST_F(CopyLockTest, AResourceFileTooShortForARecordGetsTheFlagOnly) {
    const Bytes file = ResourceFileWithWord(0);
    const Bytes head(file.begin(), file.begin() + 740);
    target_.FillResourceFile(head);
    EXPECT_EQ(0, EAEADirFSLockSet(target_.path.c_str(), 1));
    EXPECT_EQ(head, ReadFile(target_.resource));
    EXPECT_THAT(TakeCommands(), ElementsAre(Locks(target_)));
}

TEST_F(CopyLockTest, ARecordWithoutAFileInfoEntryIsStoredAsItWas) {
    const Bytes file = OneEntry(9, 100, 32) + Pattern(50);
    target_.FillResourceFile(file);
    EXPECT_EQ(0, EAEADirFSLockGet(target_.path.c_str()));
    EXPECT_EQ(0, EAEADirFSLockSet(target_.path.c_str(), 1));
    EXPECT_EQ(file, ReadFile(target_.resource));
    EXPECT_EQ("pwrite(741, 0)", TakeCalls().back());
}

// ---- Arguments ---------------------------------------------------------------------------------

TEST_F(CopyLockTest, AMissingPathIsABadArgumentToEveryGetterAndSetter) {
    for (const char* path : {static_cast<const char*>(nullptr), ""}) {
        for (const LockGetter get :
             {EAModeLockGet, EAPlatformLockGet, EAEADirFSLockGet, EAFileEAFSLockGet}) {
            EXPECT_EQ(-1, get(path));
            ExpectBadArgument();
        }
        for (const LockSetter set :
             {EAModeLockSet, EASetLockFlag, EAEADirFSLockSet, EAFileEAFSLockSet}) {
            for (const int lock : {0, 1}) {
                EXPECT_EQ(-1, set(path, lock));
                ExpectBadArgument();
            }
        }
        EXPECT_EQ(-1, EAAdoubleLockGet(path, GivenRecord));
        ExpectBadArgument();
    }
    EXPECT_EQ(-1, EAAdoubleLockGet(source_.path.c_str(), nullptr));
    ExpectBadArgument();
}

TEST_F(CopyLockTest, AMissingPathIsABadArgumentToTheCopy) {
    const char* const path = source_.path.c_str();
    for (const char* none : {static_cast<const char*>(nullptr), ""}) {
        for (const auto& [from, to] : {std::pair{none, path}, {path, none}, {none, none}}) {
            EXPECT_EQ(-1, MAVOEACopyLock(from, to, 0, 0));
            ExpectBadArgument();
            EXPECT_EQ(-1, MAVOEACopyLock(from, to, -1, -1));
            ExpectBadArgument();
            EXPECT_EQ(-1, EACopyLockState(from, to, EAModeLockGet, EAModeLockSet));
            ExpectBadArgument();
        }
    }
}

// ---- One state carried -------------------------------------------------------------------------

int getter_result;
int setter_result;
std::vector<std::string> carried;
int GivenGetter(const char* path) {
    carried.push_back(std::string("get ") + path);
    return getter_result;
}
int GivenSetter(const char* path, int lock) {
    carried.push_back(std::string("set ") + path + " " + std::to_string(lock));
    return setter_result;
}

TEST_F(CopyLockTest, WhatTheGetterSaysTheSetterIsTold) {
    for (const auto& [got, lock] : {std::pair{1, 1}, {0, 0}, {2, 0}, {522, 0}}) {
        for (const int result : {0, 1, -1, -2}) {
            SCOPED_TRACE(testing::Message() << got << " " << result);
            getter_result = got;
            setter_result = result;
            carried.clear();
            EXPECT_EQ(result < 0 ? -1 : 0, EACopyLockState("/s", "/d", GivenGetter, GivenSetter));
            EXPECT_THAT(carried, ElementsAre("get /s", "set /d " + std::to_string(lock)));
        }
    }
}

TEST_F(CopyLockTest, WhenTheGetterFailsTheSetterIsNotCalled) {
    for (const int got : {-1, -2, -522}) {
        getter_result = got;
        carried.clear();
        EXPECT_EQ(-1, EACopyLockState("/s", "/d", GivenGetter, GivenSetter));
        EXPECT_THAT(carried, ElementsAre("get /s"));
    }
}

TEST_F(CopyLockTest, NoGetterOrSetterIsABadArgument) {
    carried.clear();
    EXPECT_EQ(-1, EACopyLockState("/s", "/d", nullptr, GivenSetter));
    ExpectBadArgument();
    EXPECT_EQ(-1, EACopyLockState("/s", "/d", GivenGetter, nullptr));
    ExpectBadArgument();
    EXPECT_THAT(carried, IsEmpty());
}

// ---- The table ---------------------------------------------------------------------------------

// How a volume is asked or told: by mode, by flag and record of an EA directory, by flag and record
// of an attribute; or not at all.
constexpr char kMode = 'M';
constexpr char kEADir = 'E';
constexpr char kFileEA = 'F';
constexpr char kNothing = '.';

constexpr int kFirstType = -1;
constexpr int kLastType = 13;

// Source types 0 to 13: who is asked, and who is told at destinations 0 to 13.
struct Row {
    char getter;
    const char* setters;
};
//                                          0123456789abcd
constexpr Row kFromMode = {kMode, /*     */ "MEFE.MEM..E..."};
constexpr Row kFromEADir = {kEADir, /*   */ "MEFE.MEM..E.E."};
constexpr Row kFromFileEA = {kFileEA, /* */ "MEFE.MEM..E.E."};
constexpr Row kFromNone = {kNothing, /*  */ ".............."};
constexpr Row kTable[] = {
    kFromMode,    // 0
    kFromEADir,   // 1
    kFromFileEA,  // 2
    kFromEADir,   // 3
    kFromNone,    // 4
    kFromMode,    // 5
    kFromEADir,   // 6
    kFromMode,    // 7
    kFromNone,    // 8
    kFromNone,    // 9
    kFromEADir,   // 10
    kFromNone,    // 11
    kFromNone,    // 12
    kFromNone,    // 13
};

// What locks the source.
enum class By { kNobody, kPermissions, kFlag, kEADirRecord, kAttributeRecord };
constexpr By kEveryWay[] = {By::kNobody, By::kPermissions, By::kFlag, By::kEADirRecord,
                            By::kAttributeRecord};

bool Sees(char getter, By by) {
    switch (by) {
        case By::kNobody:
            return false;
        case By::kPermissions:
            return getter == kMode;
        case By::kFlag:
            return getter == kEADir || getter == kFileEA;
        case By::kEADirRecord:
            return getter == kEADir;
        case By::kAttributeRecord:
            return getter == kFileEA;
    }
    return false;
}

class LockTableTest : public CopyLockTest, public ::testing::WithParamInterface<int> {
 protected:
    static constexpr std::uint16_t kWordBefore = 0x3211;  // one of the two bits is set
    static constexpr std::uint16_t kWordLocked = 0xB211;
    static constexpr std::uint16_t kWordUnlocked = 0x1211;

    void LockSource(By by) const {
        source_.SetMode(by == By::kPermissions ? 0444 : 0644);
        source_.SetAttribute(AttributeRecordWithWord(by == By::kAttributeRecord ? 0x0080 : 0));
        source_.FillResourceFile(ResourceFileWithWord(by == By::kEADirRecord ? 0x0080 : 0));
        Platform().file_stat = Word(by == By::kFlag ? 0x20 : 0);
    }
    void PrepareTarget() const {
        target_.SetMode(0644);
        target_.SetAttribute(AttributeRecordWithWord(kWordBefore));
        target_.FillResourceFile(ResourceFileWithWord(kWordBefore));
    }
    // The target after it was told by `setter`.
    void ExpectTarget(char setter, bool locked) const {
        const std::uint16_t word = locked ? kWordLocked : kWordUnlocked;
        EXPECT_EQ(setter != kMode ? 0644 : locked ? 0444 : 0666, target_.Mode());
        EXPECT_EQ(AttributeRecordWithWord(setter == kFileEA ? word : kWordBefore),
                  target_.Attribute());
        EXPECT_EQ(ResourceFileWithWord(setter == kEADir ? word : kWordBefore),
                  ReadFile(target_.resource));
    }

    // Copies from and to volumes of these types; the platform tells those that are not given.
    void Run(int from, int to, By by, bool types_given) const {
        SCOPED_TRACE(testing::Message() << from << " to " << to << ", locked by way "
                                        << static_cast<int>(by) << (types_given ? ", given" : ""));
        Platform().fs_type = [&](const std::string& path, int) {
            return path == source_.path ? from : path == dir_ / "to" ? to : 99;
        };
        TakeCalls();
        TakePlatformCalls();
        const long descriptors = OpenDescriptors();
        const int free_descriptor = dup(0);
        close(free_descriptor);

        const int result = types_given ? Copy(from, to) : Copy(-1, -1);

        const auto calls = TakeCalls();
        const auto platform_calls = TakePlatformCalls();
        std::vector<std::string> commands;
        std::copy_if(calls.begin(), calls.end(), std::back_inserter(commands),
                     [](const std::string& call) { return call.starts_with("command("); });
        const Row& row = from < 0 ? kFromNone : kTable[from];
        const char setter = to < 0 ? kNothing : row.setters[to];
        const bool locked = Sees(row.getter, by);

        std::vector<std::string> expected_platform_calls;
        if (!types_given || from == -1) {
            expected_platform_calls.push_back("MAVOGetFSType(" + source_.path + ", 1)");
        }
        if (from != -1 && (!types_given || to == -1)) {
            expected_platform_calls.push_back("MAVOGetFSType(" + (dir_ / "to") + ", 1)");
        }
        if (setter != kNothing && row.getter != kMode) {
            expected_platform_calls.push_back("MLIBCFileStat(" + source_.path + ", 3)");
        }
        EXPECT_EQ(expected_platform_calls, platform_calls);

        if (from < 0 || to < 0) {  // The platform does not know the type either.
            EXPECT_EQ(-1, result);
            EXPECT_THAT(TakeLog(),
                        ElementsAre("ea_copy_lock:LINE(MAVOEACopyLock) Failed to get fs type of " +
                                    (from < 0 ? source_.path : target_.path) + "."));
        } else {
            EXPECT_EQ(row.getter == kNothing ? -2 : 0, result);
        }
        ExpectNothingReported();
        ExpectTarget(setter, locked);
        if (setter != kNothing) {
            PrepareTarget();
        } else {
            EXPECT_THAT(calls, ElementsAre("access(" + source_.path + ", 0)"));
        }
        if (setter == kEADir || setter == kFileEA) {
            EXPECT_THAT(commands, ElementsAre(locked ? Locks(target_) : Unlocks(target_)));
        } else {
            EXPECT_THAT(commands, IsEmpty());
        }
        // The flush of a resource file's record keeps its descriptor.
        EXPECT_EQ(descriptors + (setter == kEADir ? 1 : 0), OpenDescriptors());
        if (setter == kEADir) close(free_descriptor);
    }
};

TEST_P(LockTableTest, EveryDestinationIsToldWhatTheTableSays) {
    PrepareTarget();
    for (const By by : kEveryWay) {
        LockSource(by);
        for (int to = kFirstType; to <= kLastType; ++to) {
            Run(GetParam(), to, by, true);
            if (HasFailure()) return;
        }
    }
}

TEST_P(LockTableTest, TypesThatThePlatformTellsAreAsGoodAsGivenOnes) {
    PrepareTarget();
    for (const By by : kEveryWay) {
        LockSource(by);
        for (int to = kFirstType; to <= kLastType; ++to) {
            Run(GetParam(), to, by, false);
            if (HasFailure()) return;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(FromType, LockTableTest, ::testing::Range(kFirstType, kLastType + 1),
                         [](const auto& test) {
                             return test.param < 0 ? "Unknown" : std::to_string(test.param);
                         });

TEST_F(CopyLockTest, TypesBeyondTheTableAreUnknown) {
    for (const int type : {-2, -100, 14, 256, INT32_MAX, INT32_MIN}) {
        EXPECT_EQ(-2, Copy(type, 0));
        EXPECT_EQ(0, Copy(0, type));
        EXPECT_EQ(-2, Copy(type, type));
    }
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
}

// ---- The copy ----------------------------------------------------------------------------------

TEST_F(CopyLockTest, WritePermissionsGoFromOneFileToTheOther) {
    target_.SetMode(0644);
    source_.SetMode(0444);
    EXPECT_EQ(0, Copy(0, 0));
    EXPECT_EQ(0444, target_.Mode());
    target_.SetMode(0644);
    source_.SetMode(0640);
    EXPECT_EQ(0, Copy(0, 0));
    EXPECT_EQ(0666, target_.Mode());
    EXPECT_EQ(0640, source_.Mode());
}

TEST_F(CopyLockTest, AnAttributeVolumeWithoutARecordGetsTheFlag) {
    source_.SetMode(0444);
    EXPECT_EQ(0, Copy(7, 2));
    EXPECT_THAT(TakeCommands(), ElementsAre(Locks(target_)));
    EXPECT_EQ(Ascii("(none)"), target_.Attribute());
}

TEST_F(CopyLockTest, ASourceThatIsMissingTouchesNothing) {
    target_.SetMode(0644);
    ASSERT_EQ(0, symlink("nowhere", (dir_ / "dangling").c_str()));
    for (const std::string& path : {missing_, dir_ / "dangling"}) {
        for (const int type : {-1, 0, 1, 2, 4}) {
            EXPECT_EQ(0, MAVOEACopyLock(path.c_str(), target_.path.c_str(), type, type));
            EXPECT_THAT(TakeCalls(), ElementsAre("access(" + path + ", 0)"));
        }
    }
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_EQ(0644, target_.Mode());
}

TEST_F(CopyLockTest, ADestinationWithoutASlashHasNoParentToAskFor) {
    errno = ENOTDIR;
    EXPECT_EQ(-1, MAVOEACopyLock(source_.path.c_str(), "b", 0, -1));
    EXPECT_THAT(TakeLog(),
                ElementsAre(std::string("ea_copy_lock:LINE(MAVOEACopyLock) Failed to strrchr '/' "
                                        "of b, reason=") +
                            strerror(ENOTDIR) + "."));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_THAT(TakeRecords(), IsEmpty());
    // An unknown source does not come first.
    EXPECT_EQ(-1, MAVOEACopyLock(source_.path.c_str(), "b", 4, -1));
    EXPECT_EQ(1u, TakeLog().size());
    // With its type given, nobody looks for the parent.
    EXPECT_EQ(0, MAVOEACopyLock(source_.path.c_str(), "b", 0, 4));
}

TEST_F(CopyLockTest, TheDestinationsParentIsAskedForAndItsPathIsLeftAlone) {
    std::string path = target_.path;
    EXPECT_EQ(0, MAVOEACopyLock(source_.path.c_str(), path.data(), 0, -1));
    EXPECT_EQ(target_.path, path);
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(" + (dir_ / "to") + ", 1)"));
}

TEST_F(CopyLockTest, ADestinationOfAnyLengthIsTakenAsFarAsItFits) {
    const std::string parent = "/" + std::string(2000, 'p');
    const std::string path = parent + "/" + std::string(9000, 'q');
    Platform().fs_type = [](const std::string&, int) { return 4; };
    EXPECT_EQ(0, MAVOEACopyLock(source_.path.c_str(), path.c_str(), 0, -1));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(" + parent + ", 1)"));
    // The last slash that fits, at 4093 of the 4094 characters, and the first that does not.
    for (const std::size_t at : {std::size_t{4093}, std::size_t{4094}}) {
        const std::string deep = "/a/" + std::string(at - 3, 'd') + "/x";
        EXPECT_EQ(0, MAVOEACopyLock(source_.path.c_str(), deep.c_str(), 0, -1));
        EXPECT_THAT(
            TakePlatformCalls(),
            ElementsAre("MAVOGetFSType(" + (at == 4093 ? deep.substr(0, at) : "/a") + ", 1)"));
    }
}

TEST_F(CopyLockTest, AFailureIsLoggedWithTheCodeThatWasRecorded) {
    source_.SetMode(0444);
    const FailCall fault("chmod", EPERM);
    EXPECT_EQ(-1, Copy(5, 7));
    const auto records = TakeRecords();
    ASSERT_THAT(records, ElementsAre(RecordOf(0x2A00, kUnit)));
    EXPECT_THAT(TakeLog(),
                ElementsAre("ea_copy_lock:LINE [0x2A00 ea_copy_lock:" +
                            std::to_string(records[0].line) + "]EACopy lock fail: from [" +
                            source_.path + "] to [" + target_.path + "] " + strerror(EPERM)));
}

TEST_F(CopyLockTest, AFailureOfTheFlushIsLoggedWithItsCode) {
    target_.SetAttribute(AttributeRecordWithWord(0));
    const FailCall fault("setxattr", EPERM);
    EXPECT_EQ(-1, Copy(1, 2));
    const auto records = TakeRecords();
    ASSERT_THAT(records, ElementsAre(RecordOf(0x300, "ea_fileeafs_flush")));
    EXPECT_THAT(TakeLog(),
                ElementsAre("ea_copy_lock:LINE [0x0300 ea_fileeafs_flush:" +
                            std::to_string(records[0].line) + "]EACopy lock fail: from [" +
                            source_.path + "] to [" + target_.path + "] " + strerror(EPERM)));
    EXPECT_THAT(TakeCommands(), ElementsAre(Unlocks(target_)));
}

TEST_F(CopyLockTest, AFailureWithoutARecordIsLoggedToo) {
    const std::string path = dir_ / "to/none";
    EXPECT_EQ(-1, MAVOEACopyLock(source_.path.c_str(), path.c_str(), 0, 0));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_copy_lock:LINE [0x0000 :0]EACopy lock fail: from [" +
                                       source_.path + "] to [" + path + "] " + strerror(ENOENT)));
}

TEST_F(CopyLockTest, AGetterThatFailsLeavesTheDestinationAlone) {
    target_.SetMode(0644);
    {
        const FailCall fault("stat", EIO);
        EXPECT_EQ(-1, Copy(0, 0));
    }
    EXPECT_EQ(1u, TakeLog().size());
    Platform().file_stat = [](const std::string&, unsigned char*) { return -1; };
    for (const int from : {1, 2}) {
        for (const int to : {0, 1, 2, 7, 12}) {
            EXPECT_EQ(-1, Copy(from, to));
            EXPECT_EQ(1u, TakeLog().size());
        }
    }
    EXPECT_EQ(0644, target_.Mode());
    EXPECT_THAT(TakeCommands(), IsEmpty());
}

}  // namespace
}  // namespace mavoea::test

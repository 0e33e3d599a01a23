// Finder info in its two places, the resource file and the netatalk record of the attribute: each
// brought into step with the other, and the flush time that says when.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "adouble/internal.h"
#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_fixture.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr char kRecordName[] = "user.netatalk.Metadata";
constexpr char kTimeName[] = "user.mavo.filea.flushtime";

constexpr char kEaSync[] = "ea_fileeafs_finfo_ea_sync";
constexpr char kFileSync[] = "ea_fileeafs_finfo_file_sync";
constexpr char kWrite[] = "ea_eadirfs_finfo_write";
constexpr char kFlushTime[] = "ea_fileeafs_write_flush_time";
constexpr char kFlush[] = "ea_fileeafs_flush";

const Bytes kNone = Repeat(0, 32);

// A fresh record with that Finder info.
Bytes FreshRecord(const Bytes& finder_info) {
    return Hex("00 05 16 07  00 02 00 00  00*16  00 08 "
               "00 00 00 04  00 00 00 9A  00 00 00 00 "   // comment, 154, 0
               "00 00 00 08  00 00 01 62  00 00 00 10 "   // file dates, 354, 16
               "00 00 00 09  00 00 00 7A  00 00 00 20 "   // Finder info, 122, 32
               "00 00 00 0E  00 00 01 72  00 00 00 04 "   // AFP file info, 370, 4
               "80 44 45 56  00 00 01 76  00 00 00 00 "   // private device, 374
               "80 49 4E 4F  00 00 01 7E  00 00 00 00 "   // private inode, 382
               "80 53 59 4E  00 00 01 86  00 00 00 00 "   // private sync, 390
               "80 53 56 7E  00 00 01 8E  00 00 00 00 ")  // private id, 398
           + finder_info + Repeat(0, 248);
}

// A resource file that was just made, with that Finder info: 82 bytes.
Bytes FreshResourceFile(const Bytes& finder_info) {
    return Hex("00 05 16 07  00 02 00 00  'Mac OS X        '  00 02 "
               "00 00 00 09  00 00 00 32  00 00 00 20 "   // Finder info, 50, 32
               "00 00 00 02  00 00 00 52  00 00 00 00 ")  // resource fork, 82, 0
           + finder_info;
}

// A netatalk resource file of the classic layout: a record of 741 bytes with 13 entries, Finder
// info at 589, then the resource fork.
constexpr std::size_t kClassicFinderInfoAt = 589;
Bytes ClassicResourceFile(const Bytes& finder_info, const Bytes& fork) {
    Bytes file = Hex("00 05 16 07  00 02 00 00  00*16  00 0D "
                     "00 00 00 02  00 00 02 E5  00 00 00 00 "   // resource fork, 741
                     "00 00 00 03  00 00 00 B6  00 00 00 00 "   // name, 182
                     "00 00 00 04  00 00 01 B5  00 00 00 00 "   // comment, 437
                     "00 00 00 08  00 00 02 7D  00 00 00 10 "   // file dates, 637
                     "00 00 00 09  00 00 02 4D  00 00 00 20 "   // Finder info, 589
                     "00 00 00 0E  00 00 02 AD  00 00 00 04 "   // AFP file info, 685
                     "00 00 00 0D  00 00 02 A1  00 00 00 00 "   // short name, 673
                     "00 00 00 0B  00 00 02 8D  00 00 00 08 "   // ProDOS file info, 653
                     "00 00 00 0F  00 00 02 B1  00 00 00 04 "   // directory id, 689
                     "80 44 45 56  00 00 02 B5  00 00 00 08 "   // private device, 693
                     "80 49 4E 4F  00 00 02 BD  00 00 00 08 "   // private inode, 701
                     "80 53 59 4E  00 00 02 C5  00 00 00 08 "   // private sync, 709
                     "80 53 56 7E  00 00 02 CD  00 00 00 04 ")  // private id, 717
                 + Repeat(0x5A, 559);
    PutU32(file, 26 + 8, fork.size());
    std::copy(finder_info.begin(), finder_info.end(),
              file.begin() + static_cast<std::ptrdiff_t>(kClassicFinderInfoAt));
    return file + fork;
}

// A file of another program: Finder info of 32 bytes `at`, the fork before or behind it.
Bytes FileWithFinderInfoAt(std::uint32_t at, const Bytes& finder_info) {
    Bytes file = FreshResourceFile(kNone);
    PutU32(file, kFinderOffsetAt, at);
    file.resize(std::max<std::size_t>(file.size(), at + finder_info.size()), 0x77);
    std::copy(finder_info.begin(), finder_info.end(),
              file.begin() + static_cast<std::ptrdiff_t>(at));
    return file;
}

// Every layout of resource files that is understood, and where its Finder info is.
struct Layout {
    const char* name;
    Bytes file;
    std::size_t finder_info_at;
};
std::vector<Layout> Layouts(const Bytes& finder_info) {
    const StreamImage stream = {.attributes = {{"user.a", Pattern(7)}, {"user.b", Pattern(3000)}},
                                .fork = Pattern(500),
                                .finder_info = finder_info};
    StreamImage reversed = stream;
    reversed.fork_first = true;
    Bytes finder_info_only =
        Hex("00 05 16 07  00 02 00 00  00*16  00 01 "
            "00 00 00 09  00 00 00 26  00 00 00 20 ");  // at 38
    return {
        {"an empty stream", StreamImage{.finder_info = finder_info}.Build(), 50},
        {"a stream with attributes and fork", stream.Build(), 50},
        {"a stream whose fork's descriptor comes first", reversed.Build(), 50},
        {"82 bytes", FreshResourceFile(finder_info), 50},
        {"plain, with a fork", PlainAppleDouble(finder_info, Pattern(999)), 50},
        {"plain, with 5 descriptors", PlainAppleDouble(finder_info, Pattern(9), 5), 86},
        {"plain, with 13 descriptors", PlainAppleDouble(finder_info, Pattern(9), 13), 182},
        {"Finder info alone", finder_info_only + finder_info, 38},
        {"Finder info far behind", FileWithFinderInfoAt(100'000, finder_info), 100'000},
        {"netatalk's", ClassicResourceFile(finder_info, Pattern(2000)), kClassicFinderInfoAt},
    };
}

Bytes WithBytesAt(Bytes file, std::size_t at, const Bytes& part) {
    std::copy(part.begin(), part.end(), file.begin() + static_cast<std::ptrdiff_t>(at));
    return file;
}

class FinderInfoTest : public ::testing::Test, protected Identity {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        Hooks().time = [] { return static_cast<time_t>(0x12345678); };
        BeUser(0);
        WriteFile(object_, Ascii("data"));
        live_blocks_ = TakeAllocations().live;
        descriptors_ = OpenDescriptors();
    }
    void TearDown() override {
        ExpectNothingReported();
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        ExpectUnlocked();
        EXPECT_EQ(Ascii("data"), ReadFile(object_));
        ResetKernel();
        ResetPlatform();
    }

    Bytes Attribute(const char* name) const {
        Bytes value(2000);
        const ssize_t size = getxattr(object_.c_str(), name, value.data(), value.size());
        if (size < 0) return Ascii(errno == ENODATA ? "(none)" : "(not read)");
        value.resize(static_cast<std::size_t>(size));
        return value;
    }
    Bytes Record() const { return Attribute(kRecordName); }
    Bytes FlushTime() const { return Attribute(kTimeName); }
    void SetRecord(const Bytes& value) const {
        ASSERT_EQ(0, setxattr(object_.c_str(), kRecordName, value.data(), value.size(), 0))
            << strerror(errno);
    }
    void RemoveAttributes() const {
        removexattr(object_.c_str(), kRecordName);
        removexattr(object_.c_str(), kTimeName);
    }
    void FillResourceFile(const Bytes& bytes) const {
        mkdir(ea_dir_.c_str(), 0777);
        WriteFile(resource_, bytes);
    }
    void ExpectUnlocked() const {
        if (Exists(resource_)) {
            EXPECT_EQ(F_UNLCK, LockInTheWay(resource_, F_WRLCK));
        }
    }
    void ExpectNoAttributes() const {
        EXPECT_EQ(Ascii("(none)"), Record());
        EXPECT_EQ(Ascii("(none)"), FlushTime());
    }
    static void ExpectOnly(int code, const std::string& unit) {
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, unit)));
    }

    int EASync(int check = 0) const { return MAVOEAFileEAFSFinfoEASync(object_.c_str(), check); }
    int FileSync() const { return EAFileEAFSFinfoFileSync(object_.c_str()); }
    int Write(const Bytes& finder_info) const {
        return MAVOEAEADirFSFInfoWrite(object_.c_str(), finder_info.data());
    }

    TempDir dir_;
    const std::string object_ = dir_ / "object";
    const std::string ea_dir_ = dir_ / "@eaDir";
    const std::string resource_ = ea_dir_ + "/object@MavoResource";
    const std::string missing_ = dir_ / "missing";
    const std::string long_path_ = "/" + std::string(5000, 'p');
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// ---- A fresh record ----------------------------------------------------------------------------

// Promise: "Netatalk record: The AFP service's"
// Promise: "Netatalk record: An AppleDouble header"
// Promise: "Netatalk record: comment |"
// Promise: "Netatalk record: file dates |"
// Promise: "Netatalk record: Finder info |"
// Promise: "Netatalk record: AFP file info |"
// Promise: "Netatalk record: private device |"
// Promise: "Netatalk record: private inode |"
// Promise: "Netatalk record: private sync |"
// Promise: "Netatalk record: private id |"
// Promise: "Netatalk record: A fresh record"
TEST_F(FinderInfoTest, AFreshRecordIsThese402Bytes) {
    const Bytes finder_info = Pattern(32, 0x40);
    ASSERT_EQ(402u, FreshRecord(finder_info).size());
    EXPECT_EQ(0, EAFileEAFSFinfoFlush(object_.c_str(), finder_info.data()));
    EXPECT_EQ(FreshRecord(finder_info), Record());
    EXPECT_THAT(TakeCalls(),
                ElementsAre("setxattr(" + object_ + ", user.netatalk.Metadata, 402, 0)"));
}

// Promise: "Finder info and flush time: All zeros"
TEST_F(FinderInfoTest, AFreshRecordWithoutFinderInfoIsThese402Bytes) {
    EXPECT_EQ(0, EAFileEAFSFinfoFlush(object_.c_str(), kNone.data()));
    EXPECT_EQ(FreshRecord(kNone), Record());
}

// Promise: "Finder info and flush time: All zeros"
TEST_F(FinderInfoTest, FinderInfoIsStoredThatDiffersFromNoneInOneByteOnly) {
    for (std::size_t i = 0; i < 32; ++i) {
        Bytes finder_info = kNone;
        finder_info[i] = 0x80;
        ASSERT_EQ(0, EAFileEAFSFinfoFlush(object_.c_str(), finder_info.data()));
        ASSERT_EQ(FreshRecord(finder_info), Record()) << i;
    }
}

TEST_F(FinderInfoTest, AFreshRecordReplacesWhateverWasThere) {
    for (const Bytes& before : {AttributeRecord(), Repeat(9, 1000), Repeat(9, 3), Bytes()}) {
        SCOPED_TRACE(before.size());
        SetRecord(before);
        EXPECT_EQ(0, EAFileEAFSFinfoFlush(object_.c_str(), Pattern(32, 1).data()));
        EXPECT_EQ(FreshRecord(Pattern(32, 1)), Record());
    }
}

TEST_F(FinderInfoTest, AFreshRecordReadsBackWithItsEightEntries) {
    ASSERT_EQ(0, EAFileEAFSFinfoFlush(object_.c_str(), Pattern(32, 7).data()));
    EAAdouble record = {};
    ASSERT_EQ(0, MAVOEAFileEAAdoubleRead(object_.c_str(), &record));
    struct Entry {
        int slot;
        std::int64_t offset;
        std::uint32_t length;
    };
    for (const Entry& entry : {Entry{4, 154, 0},
                               {8, 354, 16},
                               {9, 122, 32},
                               {14, 370, 4},
                               {16, 374, 0},
                               {17, 382, 0},
                               {18, 390, 0},
                               {19, 398, 0}}) {
        SCOPED_TRACE(entry.slot);
        EXPECT_EQ(entry.offset, record.entries[entry.slot].offset);
        EXPECT_EQ(entry.length, record.entries[entry.slot].length);
    }
    const Bytes stored = Record();
    EXPECT_EQ(8u, U16At(stored, 24));
    EXPECT_EQ(4u, U32At(stored, 26));       // The comment is first,
    EXPECT_EQ(9u, U32At(stored, 26 + 24));  // and Finder info third.
}

TEST_F(FinderInfoTest, NullIsABadArgumentToTheFlushOfAFreshRecord) {
    EXPECT_EQ(-1, EAFileEAFSFinfoFlush(nullptr, kNone.data()));
    ExpectOnly(0xD00, kEaSync);
    EXPECT_EQ(-1, EAFileEAFSFinfoFlush(object_.c_str(), nullptr));
    ExpectOnly(0xD00, kEaSync);
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

TEST_F(FinderInfoTest, AFreshRecordThatCannotBeStoredFailsWithTheCodeOfTheFlush) {
    for (const auto& [error, code] : {std::pair{EPERM, 0x300}, {ENOSPC, 0xB00}, {EACCES, 0xB00}}) {
        const FailCall fault("setxattr", error);
        EXPECT_EQ(-1, EAFileEAFSFinfoFlush(object_.c_str(), kNone.data()));
        ExpectOnly(code, kFlush);
    }
    EXPECT_EQ(-1, EAFileEAFSFinfoFlush(missing_.c_str(), kNone.data()));
    ExpectOnly(0xB00, kFlush);
    ExpectNoAttributes();
}

// ---- From the resource file to the attribute ---------------------------------------------------

// Promise: "Finder info and flush time: Whoever changes"
// Promise: "MAVOEAFileEAFSFinfoEASync: Finder info from"
TEST_F(FinderInfoTest, WithoutAResourceFileTheRecordIsFreshWithoutFinderInfoAndTheTimeIsStamped) {
    EXPECT_EQ(0, EASync());
    EXPECT_EQ(FreshRecord(kNone), Record());
    EXPECT_EQ(Hex("12 34 56 78"), FlushTime());
    EXPECT_FALSE(Exists(ea_dir_));
}

// Promise: "MAVOEAFileEAFSFinfoEASync: Finder info from"
TEST_F(FinderInfoTest, FinderInfoOfEveryLayoutOfResourceFileGoesIntoTheRecord) {
    const Bytes finder_info = Pattern(32, 0x90);
    for (const Layout& layout : Layouts(finder_info)) {
        SCOPED_TRACE(layout.name);
        RemoveAttributes();
        FillResourceFile(layout.file);
        EXPECT_EQ(0, EASync());
        EXPECT_EQ(FreshRecord(finder_info), Record());
        EXPECT_EQ(Hex("12 34 56 78"), FlushTime());
        EXPECT_EQ(layout.file, ReadFile(resource_));
    }
}

TEST_F(FinderInfoTest, AnEmptyResourceFileHasNoFinderInfoAndStaysEmpty) {
    FillResourceFile({});
    EXPECT_EQ(0, EASync());
    EXPECT_EQ(FreshRecord(kNone), Record());
    EXPECT_EQ(Bytes(), ReadFile(resource_));
}

// Promise: "MAVOEAFileEAFSFinfoEASync: The attribute's record"
TEST_F(FinderInfoTest, WhateverElseTheRecordHeldIsReset) {
    SetRecord(AttributeRecord());
    FillResourceFile(FreshResourceFile(Pattern(32, 3)));
    EXPECT_EQ(0, EASync());
    EXPECT_EQ(FreshRecord(Pattern(32, 3)), Record());
}

TEST_F(FinderInfoTest, TheFormerRecordIsNeitherReadNorMissed) {
    SetRecord(Repeat(0xFF, 1000));
    EXPECT_EQ(0, EASync());
    EXPECT_EQ(FreshRecord(kNone), Record());
    EXPECT_THAT(TakeCallNames(), ::testing::Not(::testing::Contains("getxattr")));
}

// Promise: "MAVOEAFileEAFSFinfoEASync: Finder info from"
TEST_F(FinderInfoTest, TheRecordIsStoredBeforeTheTime) {
    EXPECT_EQ(0, EASync());
    std::vector<std::string> calls = TakeCalls();
    std::erase_if(calls, [](const std::string& call) { return !call.starts_with("setxattr("); });
    EXPECT_THAT(calls, ElementsAre("setxattr(" + object_ + ", user.netatalk.Metadata, 402, 0)",
                                   "setxattr(" + object_ + ", user.mavo.filea.flushtime, 4, 0)"));
}

TEST_F(FinderInfoTest, TheResourceFileIsReadUnderAReadLock) {
    FillResourceFile(FreshResourceFile(kNone));
    std::vector<int> locks;
    Hooks().before = [&](const std::string& name) {
        if (name == "pread") locks.push_back(LockInTheWay(resource_, F_WRLCK));
    };
    EXPECT_EQ(0, EASync());
    EXPECT_THAT(locks, ::testing::Each(F_RDLCK));
    EXPECT_FALSE(locks.empty());
}

// Promise: "MAVOEAFileEAFSFinfoEASync: what opening"
TEST_F(FinderInfoTest, AResourceFileThatCannotBeOpenedStopsTheSync) {
    FillResourceFile(FreshResourceFile(Pattern(32)));
    for (const int error : {EACCES, EMFILE, EIO, ENOTDIR, ELOOP}) {
        SCOPED_TRACE(strerror(error));
        const FailCall fault("open", error);
        EXPECT_EQ(-1, EASync());
        ExpectNothingReported();
        ExpectNoAttributes();
    }
}

TEST_F(FinderInfoTest, AResourceFileThatAnotherUserMayNotReadStopsTheSync) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    FillResourceFile(FreshResourceFile(Pattern(32)));
    ASSERT_EQ(0, chmod(dir_.path().c_str(), 0777));
    ASSERT_EQ(0, chmod(object_.c_str(), 0666));
    ASSERT_EQ(0, chmod(resource_.c_str(), 0600));
    AsUser(65534, Root::kGivenUp, [this] {
        EXPECT_EQ(-1, EASync());
        ExpectNothingReported();
    });
    ExpectNoAttributes();
}

TEST_F(FinderInfoTest, AResourceFileThatAnotherProcessWritesStopsTheSync) {
    FillResourceFile(FreshResourceFile(Pattern(32)));
    OtherProcess other(resource_, F_WRLCK);
    ASSERT_EQ(0, other.code());
    EXPECT_EQ(-1, EASync());
    ExpectOnly(0x400, "eas_lock_set");
    ExpectNoAttributes();
    other.Release();
    EXPECT_EQ(0, EASync());
    EXPECT_EQ(FreshRecord(Pattern(32)), Record());
}

TEST_F(FinderInfoTest, AResourceFileThatAnotherProcessReadsIsNoObstacle) {
    FillResourceFile(FreshResourceFile(Pattern(32)));
    const OtherProcess other(resource_, F_RDLCK);
    ASSERT_EQ(0, other.code());
    EXPECT_EQ(0, EASync());
    EXPECT_EQ(FreshRecord(Pattern(32)), Record());
}

TEST_F(FinderInfoTest, AResourceFileThatEndsTooEarlyStopsTheSync) {
    const Bytes files[] = {FreshResourceFile(Pattern(32)),
                           StreamImage{.attributes = {{"user.a", Pattern(9)}}}.Build()};
    for (const Bytes& whole : files) {
        // What attributes' values the stream has is nobody's concern here.
        const std::size_t needed = whole.size() == 82 ? 82 : 120 + 11 + 7;
        for (std::size_t size = 1; size < needed; ++size) {
            SCOPED_TRACE(size);
            FillResourceFile(Bytes(whole.begin(), whole.begin() + static_cast<ptrdiff_t>(size)));
            ASSERT_EQ(-1, EASync());
            ExpectOnly(0xA00, "eas_open");
            ExpectNoAttributes();
        }
    }
}

TEST_F(FinderInfoTest, AResourceFileWithTooManyDescriptorsStopsTheSync) {
    FillResourceFile(PlainAppleDouble(Pattern(32), Pattern(400), 14));
    EXPECT_EQ(-1, EASync());
    ExpectOnly(0xD00, "eas_open");
    ExpectNoAttributes();
}

// Promise: "MAVOEAFileEAFSFinfoEASync: what opening"
TEST_F(FinderInfoTest, ARecordThatCannotBeStoredFailsTheSyncAndTheTimeIsStampedAllTheSame) {
    for (const auto& [error, code] : {std::pair{EPERM, 0x300}, {EDQUOT, 0xB00}, {ENOTSUP, 0xB00}}) {
        SCOPED_TRACE(strerror(error));
        RemoveAttributes();
        const FailCall fault("setxattr", error, 1);
        EXPECT_EQ(-1, EASync());
        ExpectOnly(code, kFlush);
        EXPECT_EQ(Ascii("(none)"), Record());
        EXPECT_EQ(Hex("12 34 56 78"), FlushTime());
    }
}

// Promise: "MAVOEAFileEAFSFinfoEASync: what opening"
TEST_F(FinderInfoTest, ATimeThatCannotBeStampedFailsTheSync) {
    const FailCall fault("setxattr", EPERM, 2);
    EXPECT_EQ(-1, EASync());
    ExpectOnly(0x2A00, kFlushTime);
    EXPECT_EQ(FreshRecord(kNone), Record());
    EXPECT_EQ(Ascii("(none)"), FlushTime());
}

TEST_F(FinderInfoTest, AMissingObjectCannotHaveAttributes) {
    EXPECT_EQ(-1, MAVOEAFileEAFSFinfoEASync(missing_.c_str(), 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xB00, kFlush), RecordOf(0x2A00, kFlushTime)));
    EXPECT_FALSE(Exists(missing_));
    EXPECT_FALSE(Exists(ea_dir_));
}

TEST_F(FinderInfoTest, APathThatCannotBeDerivedStopsTheSync) {
    for (const int before : {0, ENOENT}) {  // An older errno does not make the file a missing one.
        errno = before;
        EXPECT_EQ(-1, MAVOEAFileEAFSFinfoEASync(long_path_.c_str(), 0));
        ExpectOnly(0xC300, "ea_path");
        errno = before;
        EXPECT_EQ(-1, MAVOEAFileEAFSFinfoEASync("", 0));
        ExpectOnly(0xD00, "ea_path");
    }
    EXPECT_THAT(TakeCallNames(), ::testing::Not(::testing::Contains("setxattr")));
}

// Promise: "MAVOEAFileEAFSFinfoEASync: 0, or -1: 0xD00"
TEST_F(FinderInfoTest, NullIsABadArgumentToTheSyncOfTheAttribute) {
    EXPECT_EQ(-1, MAVOEAFileEAFSFinfoEASync(nullptr, 0));
    ExpectOnly(0xD00, kEaSync);
    EXPECT_EQ(-1, MAVOEAFileEAFSFinfoEASync(nullptr, 2));
    ExpectOnly(0xD00, kEaSync);
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    // The type is asked for first: a volume that is not of type 2 needs no path.
    EXPECT_EQ(0, MAVOEAFileEAFSFinfoEASync(nullptr, 1));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(NULL, 1)"));
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

// Promise: "Finder info and flush time: With checkFSType 1"
TEST_F(FinderInfoTest, WithTheCheckOnlyVolumesOfType2AreSynced) {
    FillResourceFile(FreshResourceFile(Pattern(32)));
    for (int type = -1; type <= 13; ++type) {
        SCOPED_TRACE(type);
        RemoveAttributes();
        Platform().fs_type = [type](const std::string&, int) { return type; };
        EXPECT_EQ(0, EASync(1));
        EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(" + object_ + ", 1)"));
        if (type == 2) {
            EXPECT_EQ(FreshRecord(Pattern(32)), Record());
            EXPECT_EQ(Hex("12 34 56 78"), FlushTime());
            TakeCallNames();
        } else {
            ExpectNoAttributes();
            EXPECT_THAT(TakeCallNames(), IsEmpty());
        }
    }
}

// Promise: "Finder info and flush time: with any other value"
TEST_F(FinderInfoTest, WithoutTheCheckNobodyIsAskedForTheType) {
    Platform().fs_type = [](const std::string&, int) { return 0; };
    for (const int check : {0, 2, -1, 256}) {
        SCOPED_TRACE(check);
        RemoveAttributes();
        EXPECT_EQ(0, EASync(check));
        EXPECT_EQ(FreshRecord(kNone), Record());
        EXPECT_EQ(Hex("12 34 56 78"), FlushTime());
        EXPECT_THAT(TakePlatformCalls(),
                    ::testing::Not(::testing::Contains("MAVOGetFSType(" + object_ + ", 1)")));
    }
}

TEST_F(FinderInfoTest, EveryFailingCallOfTheSyncOfTheAttributeLeavesNothingHalfDone) {
    const Bytes file =
        StreamImage{
            .attributes = {{"user.a", Pattern(9)}}, .fork = Pattern(99), .finder_info = Pattern(32)}
            .Build();
    FillResourceFile(file);
    for (int nth = 1;; ++nth) {
        RemoveAttributes();
        const FailNthCall fault(nth, EIO);
        const int result = EASync();
        SCOPED_TRACE(testing::Message() << nth << " " << fault.name());
        if (!fault.fired()) {
            EXPECT_EQ(0, result);
            EXPECT_LT(4, nth);
            break;
        }
        if (result == 0) {
            EXPECT_EQ(FreshRecord(Pattern(32)), Record());
        } else {
            EXPECT_EQ(-1, result);
            EXPECT_THAT(Record(), AnyOf(Ascii("(none)"), FreshRecord(Pattern(32))));
        }
        TakeRecords();
        TakeLog();
        EXPECT_EQ(file, ReadFile(resource_));
        ASSERT_EQ(descriptors_, OpenDescriptors());
        ASSERT_EQ(live_blocks_, TakeAllocations().live);
        ExpectUnlocked();
    }
}

// ---- Finder info of the attribute's record -----------------------------------------------------

TEST_F(FinderInfoTest, FinderInfoOfTheRecordIsRead) {
    SetRecord(AttributeRecord());
    Bytes found = Repeat(0xEE, 33);
    EXPECT_EQ(0, EAFileEAFSFinfoRead(object_.c_str(), found.data()));
    EXPECT_EQ(Pattern(32, 0x40) + Repeat(0xEE, 1), found);
}

TEST_F(FinderInfoTest, WithoutARecordThereIsNoFinderInfoToRead) {
    Bytes found = Repeat(0xEE, 32);
    EXPECT_EQ(1, EAFileEAFSFinfoRead(object_.c_str(), found.data()));
    EXPECT_EQ(1, EAFileEAFSFinfoRead(missing_.c_str(), found.data()));
    EXPECT_EQ(Repeat(0xEE, 32), found);
}

TEST_F(FinderInfoTest, NullIsABadArgumentToTheReadOfFinderInfo) {
    Bytes found = Repeat(0xEE, 32);
    EXPECT_EQ(-1, EAFileEAFSFinfoRead(nullptr, found.data()));
    ExpectOnly(0xD00, kFileSync);
    EXPECT_EQ(-1, EAFileEAFSFinfoRead(object_.c_str(), nullptr));
    ExpectOnly(0xD00, kFileSync);
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

TEST_F(FinderInfoTest, OnlyFinderInfoThatLiesWholeInTheDataIsThere) {
    struct Case {
        std::uint32_t offset;
        std::uint32_t length;
        Bytes expected;  // empty: absent
    };
    const Bytes record = AttributeRecord();
    const Bytes behind(record.begin() + 370, record.end());  // 32 bytes from 370 on
    const Case kCases[] = {
        {122, 32, Pattern(32, 0x40)},
        {122, 33, Pattern(32, 0x40)},
        {122, 902, Pattern(32, 0x40)},  // overlaps everything behind it
        {122, 31, {}},
        {122, 0, {}},
        {1023, 1, {}},
        {1023, 0, {}},
        {1000, 24, {}},
        {993, 31, {}},
        {992, 32, kNone},  // the last one that lies in the data, past the bytes that were read
        {370, 32, behind},
        {384, 32, kNone},  // begins in the record and ends behind it
    };
    for (const Case& one : kCases) {
        SCOPED_TRACE(testing::Message() << one.offset << ", " << one.length);
        Bytes changed = record;
        PutU32(changed, 26 + 4, one.offset);
        PutU32(changed, 26 + 8, one.length);
        SetRecord(changed);
        Bytes found = Repeat(0xEE, 32);
        EXPECT_EQ(0, EAFileEAFSFinfoRead(object_.c_str(), found.data()));
        EXPECT_EQ(one.expected.empty() ? Repeat(0xEE, 32) : one.expected, found);
    }
}

TEST_F(FinderInfoTest, EntriesThatShareTheirBytesAreReadAllTheSame) {
    Bytes record = AttributeRecord();
    for (std::size_t i = 1; i < 8; ++i) PutU32(record, 26 + 12 * i + 4, 122);
    SetRecord(record);
    Bytes found(32);
    EXPECT_EQ(0, EAFileEAFSFinfoRead(object_.c_str(), found.data()));
    EXPECT_EQ(Pattern(32, 0x40), found);
}

TEST_F(FinderInfoTest, FinderInfoThatRunsPastTheDataMakesTheRecordABadOne) {
    for (const auto& [offset, length] : {std::pair{993u, 32u},
                                         {1024u, 0u},
                                         {122u, 903u},
                                         {122u, 0xFFFFFFFFu},
                                         {0xFFFFFFE0u, 32u}}) {
        SCOPED_TRACE(testing::Message() << offset << ", " << length);
        Bytes record = AttributeRecord();
        PutU32(record, 26 + 4, offset);
        PutU32(record, 26 + 8, length);
        SetRecord(record);
        Bytes found = Repeat(0xEE, 32);
        EXPECT_EQ(-1, EAFileEAFSFinfoRead(object_.c_str(), found.data()));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_adouble_read"),
                                               RecordOf(0xA00, "ea_fileafs_adouble_read")));
        EXPECT_EQ(2u, TakeLog().size());
        EXPECT_EQ(Repeat(0xEE, 32), found);
    }
}

// ---- From the attribute to the resource file ---------------------------------------------------

TEST_F(FinderInfoTest, WithoutARecordNoResourceFileIsMade) {
    EXPECT_EQ(0, FileSync());
    EXPECT_FALSE(Exists(ea_dir_));
    EXPECT_EQ(0, EAFileEAFSFinfoFileSync(missing_.c_str()));
    FillResourceFile(FreshResourceFile(Pattern(32)));
    EXPECT_EQ(0, FileSync());
    EXPECT_EQ(FreshResourceFile(Pattern(32)), ReadFile(resource_));
}

// Promise: "Finder info and flush time: File-EA volumes"
TEST_F(FinderInfoTest, FinderInfoOfTheRecordGoesIntoANewResourceFile) {
    SetRecord(AttributeRecord());
    EXPECT_EQ(0, FileSync());
    EXPECT_EQ(FreshResourceFile(Pattern(32, 0x40)), ReadFile(resource_));
    EXPECT_EQ(AttributeRecord(), Record());
    EXPECT_EQ(Ascii("(none)"), FlushTime());
}

TEST_F(FinderInfoTest, FinderInfoOfTheRecordReplacesTheOneOfEveryLayoutOfResourceFile) {
    SetRecord(AttributeRecord());
    for (const Layout& layout : Layouts(Pattern(32, 0xB0))) {
        SCOPED_TRACE(layout.name);
        FillResourceFile(layout.file);
        EXPECT_EQ(0, FileSync());
        EXPECT_EQ(WithBytesAt(layout.file, layout.finder_info_at, Pattern(32, 0x40)),
                  ReadFile(resource_));
    }
}

// Promise: "Netatalk record: Finder info or AFP"
TEST_F(FinderInfoTest, ARecordWithoutFinderInfoLeavesTheResourceFileAsItIs) {
    struct Case {
        std::uint32_t offset;
        std::uint32_t length;
    };
    // Too short, and over the header: over its magic, its last descriptor, its last byte.
    constexpr Case kAbsent[] = {{122, 31}, {122, 0}, {1023, 1}, {1, 32}, {110, 32}, {121, 32}};
    for (const Case& one : kAbsent) {
        SCOPED_TRACE(testing::Message() << one.offset << ", " << one.length);
        Bytes record = AttributeRecord();
        PutU32(record, 26 + 4, one.offset);
        PutU32(record, 26 + 8, one.length);
        SetRecord(record);
        for (const Layout& layout : Layouts(Pattern(32, 0xB0))) {
            FillResourceFile(layout.file);
            EXPECT_EQ(0, FileSync());
            EXPECT_EQ(layout.file, ReadFile(resource_)) << layout.name;
        }
        unlink(resource_.c_str());
        EXPECT_EQ(0, FileSync());
        EXPECT_FALSE(Exists(resource_));
    }
    SetRecord(AttributeRecord());  // One that begins right behind the header is one.
    FillResourceFile(FreshResourceFile(kNone));
    EXPECT_EQ(0, FileSync());
    EXPECT_EQ(FreshResourceFile(Pattern(32, 0x40)), ReadFile(resource_));
}

TEST_F(FinderInfoTest, ABadRecordTouchesNoResourceFile) {
    Bytes record = AttributeRecord();
    record.resize(401);
    SetRecord(record);
    EXPECT_EQ(-1, FileSync());
    ExpectOnly(0xA00, "ea_fileafs_adouble_read");
    EXPECT_EQ(1u, TakeLog().size());
    EXPECT_FALSE(Exists(ea_dir_));
}

TEST_F(FinderInfoTest, NullIsABadArgumentToTheSyncOfTheResourceFile) {
    EXPECT_EQ(-1, EAFileEAFSFinfoFileSync(nullptr));
    ExpectOnly(0xD00, kFileSync);
}

TEST_F(FinderInfoTest, AFailedWriteFailsTheSyncOfTheResourceFile) {
    SetRecord(AttributeRecord());
    FillResourceFile(FreshResourceFile(Pattern(32)));
    const FailCall fault("pwrite", EIO);
    EXPECT_EQ(-1, FileSync());
    ExpectOnly(0xB00, kWrite);
}

// Promise: "Finder info and flush time: File-EA volumes"
TEST_F(FinderInfoTest, FinderInfoComesBackFromEitherPlace) {
    const Bytes finder_info = Hex("'TEXTttxt' 40 00  FF*22");
    ASSERT_EQ(0, EAFileEAFSFinfoFlush(object_.c_str(), finder_info.data()));
    ASSERT_EQ(0, FileSync());
    RemoveAttributes();
    ASSERT_EQ(0, EASync());
    EXPECT_EQ(FreshRecord(finder_info), Record());
    ASSERT_EQ(0, unlink(resource_.c_str()));
    ASSERT_EQ(0, FileSync());
    EXPECT_EQ(FreshResourceFile(finder_info), ReadFile(resource_));
}

// ---- Writing into the resource file ------------------------------------------------------------

// Promise: "MAVOEAEADirFSFInfoWrite: one that is missing"
// Promise: "Where metadata lies: `D/@eaDir/N@MavoResource`"
// Promise: "AppleDouble: A **resource file** that the library"
TEST_F(FinderInfoTest, AMissingResourceFileIsMadeOf82Bytes) {
    const Bytes finder_info = Pattern(32, 0xC0);
    ASSERT_EQ(82u, FreshResourceFile(finder_info).size());
    const Umask umask(022);
    EXPECT_EQ(0, Write(finder_info));
    EXPECT_EQ(FreshResourceFile(finder_info), ReadFile(resource_));
    EXPECT_EQ(0755, ModeOf(resource_));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("object@MavoResource"));
}

TEST_F(FinderInfoTest, AResourceFileIsMadeOfNoFinderInfoToo) {
    EXPECT_EQ(0, Write(kNone));
    EXPECT_EQ(FreshResourceFile(kNone), ReadFile(resource_));
}

TEST_F(FinderInfoTest, AnEmptyResourceFileIsFilledLikeANewOne) {
    FillResourceFile({});
    EXPECT_EQ(0, Write(Pattern(32)));
    EXPECT_EQ(FreshResourceFile(Pattern(32)), ReadFile(resource_));
}

TEST_F(FinderInfoTest, AResourceFileNeedsNoObject) {
    EXPECT_EQ(0, MAVOEAEADirFSFInfoWrite(missing_.c_str(), Pattern(32).data()));
    EXPECT_EQ(FreshResourceFile(Pattern(32)), ReadFile(ea_dir_ + "/missing@MavoResource"));
}

// Promise: "MAVOEAEADirFSFInfoWrite: Writes"
TEST_F(FinderInfoTest, OfAnExistingFileOnlyTheFinderInfoChanges) {
    for (const Layout& layout : Layouts(Pattern(32, 0xB0))) {
        SCOPED_TRACE(layout.name);
        FillResourceFile(layout.file);
        EXPECT_EQ(0, Write(Pattern(32, 0x21)));
        EXPECT_EQ(WithBytesAt(layout.file, layout.finder_info_at, Pattern(32, 0x21)),
                  ReadFile(resource_));
    }
}

TEST_F(FinderInfoTest, OnlyThe32BytesOfFinderInfoAreWritten) {
    FillResourceFile(StreamImage{.attributes = {{"user.a", Pattern(9)}}}.Build());
    EXPECT_EQ(0, Write(Pattern(32)));
    std::vector<std::string> calls = TakeCalls();
    std::erase_if(calls, [](const std::string& call) {
        return !call.starts_with("pwrite") && !call.starts_with("ftruncate");
    });
    EXPECT_THAT(calls, ElementsAre("pwrite(32, 50)"));
}

// Promise: "MAVOEAEADirFSFInfoWrite: Writes"
TEST_F(FinderInfoTest, TheResourceFileIsWrittenUnderTheWriteLock) {
    for (const bool existed : {false, true}) {
        SCOPED_TRACE(existed);
        int locked = -1;
        Hooks().before = [&](const std::string& name) {
            if (name == "pwrite") locked = LockInTheWay(resource_, F_RDLCK);
        };
        EXPECT_EQ(0, Write(Pattern(32)));
        EXPECT_EQ(F_WRLCK, locked);
    }
}

// Promise: "MAVOEAEADirFSFInfoWrite: 0, or -1: 0xD00"
TEST_F(FinderInfoTest, NullIsABadArgumentToTheWriteOfFinderInfo) {
    EXPECT_EQ(-1, MAVOEAEADirFSFInfoWrite(nullptr, kNone.data()));
    ExpectOnly(0xD00, kWrite);
    EXPECT_EQ(-1, MAVOEAEADirFSFInfoWrite(object_.c_str(), nullptr));
    ExpectOnly(0xD00, kWrite);
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_FALSE(Exists(ea_dir_));
}

// Promise: "MAVOEAEADirFSFInfoWrite: 0, or -1: 0xD00"
TEST_F(FinderInfoTest, AFileWithoutAFinderInfoEntryIsRefusedAndStaysAsItIs) {
    Bytes fork_only = OneEntry(2, 741, 100) + Pattern(100);
    Bytes no_entry = Hex("00 05 16 07  00 02 00 00  00*16  00 00") + Repeat(0, 200);
    Bytes not_appledouble = Repeat(0, 500);
    for (const Bytes& file : {fork_only, no_entry, not_appledouble}) {
        FillResourceFile(file);
        EXPECT_EQ(-1, Write(Pattern(32)));
        ExpectOnly(0xD00, kWrite);
        EXPECT_EQ(file, ReadFile(resource_));
    }
}

TEST_F(FinderInfoTest, FinderInfoIsNotWrittenOverTheHeader) {
    for (std::uint32_t at = 0; at < 50; ++at) {
        SCOPED_TRACE(at);
        Bytes file = FreshResourceFile(Pattern(32)) + Pattern(100);
        PutU32(file, kFinderOffsetAt, at);
        FillResourceFile(file);
        EXPECT_EQ(-1, Write(Pattern(32, 0x33)));
        ExpectOnly(0xD00, kWrite);
        EXPECT_EQ(file, ReadFile(resource_));
    }
}

// Promise: "MAVOEAEADirFSFInfoWrite: When nothing"
TEST_F(FinderInfoTest, AFailedWriteLeavesNoEmptyResourceFileBehind) {
    for (const int error : {ENOSPC, EIO, EDQUOT}) {
        const FailCall fault("pwrite", error);
        EXPECT_EQ(-1, Write(Pattern(32)));
        ExpectOnly(0xB00, kWrite);
        EXPECT_FALSE(Exists(resource_));
    }
}

TEST_F(FinderInfoTest, AFailedWriteNeverRemovesAFileWithContent) {
    const Bytes file = FreshResourceFile(Pattern(32));
    FillResourceFile(file);
    const FailCall fault("pwrite", ENOSPC);
    EXPECT_EQ(-1, Write(Pattern(32, 1)));
    ExpectOnly(0xB00, kWrite);
    EXPECT_EQ(file, ReadFile(resource_));
}

// Promise: "MAVOEAEADirFSFInfoWrite: 0xB00"
TEST_F(FinderInfoTest, AShortWriteIsAFailedOne) {
    const Bytes file = FreshResourceFile(Pattern(32));
    FillResourceFile(file);
    for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{31}}) {
        const ShortCall fault("pwrite", 1, size);
        EXPECT_EQ(-1, Write(Pattern(32, 1)));
        ExpectOnly(0xB00, kWrite);
        EXPECT_EQ(file.size(), ReadFile(resource_).size());
    }
}

TEST_F(FinderInfoTest, ANewFileThatWasWrittenInPartStaysAndAnEmptyOneGoes) {
    for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{81}}) {
        SCOPED_TRACE(size);
        const ShortCall fault("pwrite", 1, size);
        EXPECT_EQ(-1, Write(Pattern(32)));
        ExpectOnly(0xB00, kWrite);
        EXPECT_EQ(size > 0, Exists(resource_));
        if (size > 0) {
            EXPECT_EQ(size, ReadFile(resource_).size());
        }
        unlink(resource_.c_str());
    }
}

TEST_F(FinderInfoTest, AResourceFileThatAnotherProcessUsesIsNotWritten) {
    const Bytes file = FreshResourceFile(Pattern(32));
    FillResourceFile(file);
    for (const int lock : {F_RDLCK, F_WRLCK}) {
        const OtherProcess other(resource_, lock);
        ASSERT_EQ(0, other.code());
        EXPECT_EQ(-1, Write(Pattern(32, 1)));
        ExpectOnly(0x400, "eas_lock_set");
        EXPECT_EQ(file, ReadFile(resource_));
    }
    EXPECT_EQ(0, Write(Pattern(32, 1)));
}

TEST_F(FinderInfoTest, AFailedCallLeavesAnEmptyResourceFileThatWasThereBefore) {
    FillResourceFile({});
    {
        const FailCall fault("setlock", EAGAIN);
        EXPECT_EQ(-1, Write(Pattern(32)));
        ExpectOnly(0x400, "eas_lock_set");
        EXPECT_EQ(Bytes(), ReadFile(resource_));
    }
    const FailCall fault("pwrite", ENOSPC);
    EXPECT_EQ(-1, Write(Pattern(32)));
    ExpectOnly(0xB00, kWrite);
    EXPECT_EQ(Bytes(), ReadFile(resource_));
}

// Promise: "MAVOEAEADirFSFInfoWrite: When nothing"
TEST_F(FinderInfoTest, AFileThatAnotherProcessHasMadeMeanwhileIsNotRemoved) {
    bool made = false;
    Hooks().fails = [&](const std::string& call) {
        if (call.starts_with("open(" + resource_) && call.find("O_CREAT") != std::string::npos) {
            WriteFile(resource_, {});
            made = true;
        }
        return call.starts_with("pwrite") ? ENOSPC : 0;
    };
    EXPECT_EQ(-1, Write(Pattern(32)));
    ExpectOnly(0xB00, kWrite);
    EXPECT_TRUE(made);
    EXPECT_EQ(Bytes(), ReadFile(resource_));
}

// Promise: "MAVOEAEADirFSFInfoWrite: When nothing"
TEST_F(FinderInfoTest, AFileThatAnotherProcessHasLockedIsNotRemovedEvenByWhoMadeIt) {
    std::unique_ptr<OtherProcess> other;
    bool started = false;  // In the other process, too.
    Hooks().before = [&](const std::string& name) {
        if (name != "setlock" || std::exchange(started, true)) return;
        other = std::make_unique<OtherProcess>(resource_, F_WRLCK);
    };
    EXPECT_EQ(-1, Write(Pattern(32)));
    ExpectOnly(0x400, "eas_lock_set");
    EXPECT_EQ(Bytes(), ReadFile(resource_));
    ASSERT_NE(nullptr, other);
    EXPECT_EQ(0, other->code());
}

// Promise: "MAVOEAEADirFSFInfoWrite: One that is removed"
TEST_F(FinderInfoTest, AFileThatIsRemovedBeforeItIsLockedIsMadeAnew) {
    int locks = 0;
    Hooks().before = [&](const std::string& name) {
        if (name == "setlock" && ++locks == 1) unlink(resource_.c_str());
    };
    EXPECT_EQ(0, Write(Pattern(32)));
    EXPECT_EQ(FreshResourceFile(Pattern(32)), ReadFile(resource_));
}

// Promise: "MAVOEAEADirFSFInfoWrite: One that is removed"
TEST_F(FinderInfoTest, AFileThatIsReplacedBeforeItIsLockedIsLeftForTheOneInItsPlace) {
    const Bytes theirs = StreamImage{.attributes = {{"user.a", Pattern(9)}}}.Build();
    for (const bool existed : {false, true}) {
        SCOPED_TRACE(existed);
        unlink(resource_.c_str());
        if (existed) FillResourceFile(FreshResourceFile(kNone));
        int locks = 0;
        Hooks().before = [&](const std::string& name) {
            if (name != "setlock" || ++locks != 1) return;
            ASSERT_EQ(0, rename(resource_.c_str(), (dir_ / "former").c_str()));
            WriteFile(resource_, theirs);
        };
        EXPECT_EQ(0, Write(Pattern(32)));
        EXPECT_EQ(WithBytesAt(theirs, 50, Pattern(32)), ReadFile(resource_));
        EXPECT_EQ(existed ? FreshResourceFile(kNone) : Bytes(), ReadFile(dir_ / "former"));
    }
}

// Promise: "MAVOEAEADirFSFInfoWrite: 0x400"
TEST_F(FinderInfoTest, AFileThatIsRemovedTimeAndAgainIsGivenUp) {
    int locks = 0;
    Hooks().before = [&](const std::string& name) {
        if (name == "setlock" && Exists(resource_)) {
            unlink(resource_.c_str());
            ++locks;
        }
    };
    EXPECT_EQ(-1, Write(Pattern(32)));
    EXPECT_EQ(EAGAIN, errno);
    ExpectOnly(0x400, kWrite);
    EXPECT_LT(1, locks);
    EXPECT_GT(100, locks);
}

TEST_F(FinderInfoTest, AFileThatHasTakenThePlaceOfTheOneThatCouldNotBeWrittenIsNotRemoved) {
    Hooks().before = [this](const std::string& name) {
        if (name != "pwrite") return;
        ASSERT_EQ(0, rename(resource_.c_str(), (dir_ / "former").c_str()));
        WriteFile(resource_, {});
    };
    const FailCall fault("pwrite", ENOSPC);
    EXPECT_EQ(-1, Write(Pattern(32)));
    ExpectOnly(0xB00, kWrite);
    EXPECT_TRUE(Exists(resource_));
    EXPECT_TRUE(Exists(dir_ / "former"));
}

TEST_F(FinderInfoTest, AFileIsRemovedUnderItsLock) {
    int locked = -1;
    Hooks().before = [&](const std::string& name) {
        if (name == "unlink") locked = LockInTheWay(resource_, F_RDLCK);
    };
    const FailCall fault("pwrite", ENOSPC);
    EXPECT_EQ(-1, Write(Pattern(32)));
    ExpectOnly(0xB00, kWrite);
    EXPECT_FALSE(Exists(resource_));
    EXPECT_EQ(F_WRLCK, locked);
}

// Promise: "MAVOEAEADirFSFInfoWrite: what MAVOEAOpen()"
TEST_F(FinderInfoTest, ADamagedResourceFileIsNeitherWrittenNorRemoved) {
    const Bytes whole = FreshResourceFile(Pattern(32));
    for (std::size_t size = 1; size < whole.size(); ++size) {
        SCOPED_TRACE(size);
        const Bytes file(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size));
        FillResourceFile(file);
        ASSERT_EQ(-1, Write(Pattern(32, 1)));
        ExpectOnly(0xA00, "eas_open");
        ASSERT_EQ(file, ReadFile(resource_));
    }
    const Bytes file = PlainAppleDouble(Pattern(32), Pattern(400), 14);
    FillResourceFile(file);
    EXPECT_EQ(-1, Write(Pattern(32, 1)));
    ExpectOnly(0xD00, "eas_open");
    EXPECT_EQ(file, ReadFile(resource_));
}

// Promise: "MAVOEAEADirFSFInfoWrite: what MAVOEAOpen()"
TEST_F(FinderInfoTest, AResourceFileThatCannotBeOpenedOrMadeIsNotWritten) {
    FillResourceFile(FreshResourceFile(kNone));
    {
        const FailCall fault("open", EACCES);
        EXPECT_EQ(-1, Write(Pattern(32)));
        ExpectNothingReported();
    }
    EXPECT_EQ(FreshResourceFile(kNone), ReadFile(resource_));
    std::filesystem::remove(resource_);
    {
        const FailCall fault("mkdir", EROFS);
        EXPECT_EQ(-1, Write(Pattern(32)));
        ExpectOnly(0x3C00, "ea_mkdir.c");
    }
    EXPECT_EQ(-1, MAVOEAEADirFSFInfoWrite(long_path_.c_str(), kNone.data()));
    ExpectOnly(0xC300, "ea_path");
}

// The calls that a file is made or changed with, each failing once.
class FinderInfoWriteFaultTest : public FinderInfoTest,
                                 public ::testing::WithParamInterface<bool> {};

TEST_P(FinderInfoWriteFaultTest, EveryFailingCallOfTheWriteLeavesTheFileAsItWasOrAsItShouldBe) {
    const bool exists = GetParam();
    const StreamImage before = {.attributes = {{"user.a", Pattern(9)}},
                                .fork = Pattern(99),
                                .finder_info = Pattern(32, 0x60)};
    StreamImage changed = before;
    changed.finder_info = Pattern(32);
    const Bytes after = exists ? changed.Build() : FreshResourceFile(Pattern(32));
    for (int nth = 1;; ++nth) {
        unlink(resource_.c_str());
        if (exists) FillResourceFile(before.Build());
        const FailNthCall fault(nth, EIO);
        const int result = Write(Pattern(32));
        SCOPED_TRACE(testing::Message() << nth << " " << fault.name());
        if (!fault.fired()) {
            EXPECT_EQ(0, result);
            EXPECT_LT(5, nth);
            break;
        }
        TakeRecords();
        TakeLog();
        if (result == 0) {
            EXPECT_EQ(after, ReadFile(resource_));
        } else {
            EXPECT_EQ(-1, result);
            if (exists) {
                EXPECT_EQ(before.Build(), ReadFile(resource_));
            } else {
                // What could not be locked may be another's by now.
                EXPECT_TRUE(fault.name() == "setlock" || !Exists(resource_));
            }
        }
        ASSERT_EQ(descriptors_, OpenDescriptors());
        ASSERT_EQ(live_blocks_, TakeAllocations().live);
        ExpectUnlocked();
    }
}

INSTANTIATE_TEST_SUITE_P(ResourceFile, FinderInfoWriteFaultTest, ::testing::Bool(),
                         [](const auto& test) { return test.param ? "Existing" : "New"; });

// ---- Writing through a handle ------------------------------------------------------------------

class WriteFinderInfoTest : public StreamTest {
 protected:
    ~WriteFinderInfoTest() override { ExpectNothingReported(); }

    static void SetFinderInfo(const Handle& handle, const Bytes& finder_info) {
        std::copy(finder_info.begin(), finder_info.end(), handle->header + kFinderInfoAt);
    }
    static void ExpectOnly(int code) {
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, kWrite)));
    }
};

// Promise: "EASWriteFinderInfo: Writes"
TEST_F(WriteFinderInfoTest, TheHandlesFinderInfoIsWrittenWhereTheFilesIs) {
    for (const Layout& layout : Layouts(Pattern(32, 0xB0))) {
        SCOPED_TRACE(layout.name);
        Fill(layout.file);
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        SetFinderInfo(handle, Pattern(32, 0x21));
        EXPECT_EQ(0, EASWriteFinderInfo(handle.get()));
        EXPECT_EQ(WithBytesAt(layout.file, layout.finder_info_at, Pattern(32, 0x21)), Contents());
    }
}

// Promise: "EASWriteFinderInfo: 0, or -1: 0xD00"
TEST_F(WriteFinderInfoTest, NullAndAHandleWithoutADescriptorAreBadArguments) {
    EXPECT_EQ(-1, EASWriteFinderInfo(nullptr));
    ExpectOnly(0xD00);
    for (const int lock : {F_WRLCK, F_RDLCK}) {  // The descriptor counts before the lock does.
        EASHandle handle = {};
        handle.fd = -1;
        handle.lockType = lock;
        EXPECT_EQ(-1, EASWriteFinderInfo(&handle));
        ExpectOnly(0xD00);
    }
}

// Promise: "EASWriteFinderInfo: 0x300"
TEST_F(WriteFinderInfoTest, AHandleWithoutAWriteLockMayNotWrite) {
    const Bytes file = FreshResourceFile(Pattern(32));
    Fill(file);
    for (const int lock : {F_RDLCK, F_UNLCK}) {
        const Handle handle = Open(lock);
        ASSERT_NE(nullptr, handle);
        SetFinderInfo(handle, Pattern(32, 0x21));
        EXPECT_EQ(-1, EASWriteFinderInfo(handle.get()));
        ExpectOnly(0x300);
    }
    EXPECT_EQ(file, Contents());
}

// Promise: "EASWriteFinderInfo: 0, or -1: 0xD00"
TEST_F(WriteFinderInfoTest, AnOffsetThatCannotBeSoughtIsLogged) {
    const Bytes file = FreshResourceFile(Pattern(32));
    Fill(file);
    const Handle handle = Open();
    for (const int error : {EINVAL, EOVERFLOW}) {
        const FailCall fault("lseek", error);
        EXPECT_EQ(-1, EASWriteFinderInfo(handle.get()));
        ExpectOnly(0xD00);
        EXPECT_THAT(TakeLog(), ElementsAre(std::string("ea_eadirfs_finfo_write:LINE Error: lseek "
                                                       "error (") +
                                           strerror(error) + ")"));
    }
    EXPECT_EQ(file, Contents());
}

// Promise: "EASWriteFinderInfo: 0xB00"
TEST_F(WriteFinderInfoTest, FewerThan32BytesWrittenAreAFailure) {
    Fill(FreshResourceFile(Pattern(32)));
    const Handle handle = Open();
    {
        const FailCall fault("pwrite", EIO);
        EXPECT_EQ(-1, EASWriteFinderInfo(handle.get()));
        ExpectOnly(0xB00);
    }
    for (const std::size_t size : {std::size_t{0}, std::size_t{31}}) {
        const ShortCall fault("pwrite", 1, size);
        EXPECT_EQ(-1, EASWriteFinderInfo(handle.get()));
        ExpectOnly(0xB00);
    }
}

// Promise: "EASWriteFinderInfo: 0, or -1: 0xD00"
TEST_F(WriteFinderInfoTest, AHandleWhoseFileHasNoFinderInfoEntryIsRefused) {
    const Bytes file = OneEntry(2, 741, 100) + Pattern(100);
    Fill(file);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(-1, EASWriteFinderInfo(handle.get()));
    ExpectOnly(0xD00);
    EXPECT_EQ(file, Contents());
}

TEST_F(WriteFinderInfoTest, OffsetsAreUnsigned) {
    Fill(FreshResourceFile(Pattern(32)));
    const Handle handle = Open();
    SetFinderInfo(handle, Pattern(32, 0x21));
    PutU32({handle->header, 120}, kFinderOffsetAt, 0xFFFFFFF0);
    // Past 4 GiB: the file has a hole there, if the filesystem lets it.
    if (EASWriteFinderInfo(handle.get()) != 0) {
        TakeRecords();
        TakeLog();
        EXPECT_EQ(82u, FileSize());
        return;
    }
    EXPECT_EQ(0x100000010u, FileSize());
    EXPECT_EQ(Pattern(32, 0x21), Contents(32, 0xFFFFFFF0));
}

// ---- Flush time --------------------------------------------------------------------------------

// Promise: "mavoea.h: On disk every multi-byte field is big-endian"
// Promise: "Finder info and flush time: Whoever changes"
// Promise: "Netatalk record: The **flush time**"
TEST_F(FinderInfoTest, TheFlushTimeIsTheSecondsIn4BytesTheHighestFirst) {
    struct Case {
        std::int64_t time;
        const char* stored;
    };
    constexpr Case kCases[] = {
        {0, "00 00 00 00"},
        {1, "00 00 00 01"},
        {0x5F3C2B1A, "5F 3C 2B 1A"},
        {0x7FFFFFFF, "7F FF FF FF"},
        {-1, "FF FF FF FF"},
        // What 32 bits cannot tell wraps.
        {0x80000000, "80 00 00 00"},
        {0x15F3C2B1A, "5F 3C 2B 1A"},
        {0x7FFFFFFF00000002, "00 00 00 02"},
    };
    for (const Case& one : kCases) {
        SCOPED_TRACE(one.time);
        Hooks().time = [&one] { return static_cast<time_t>(one.time); };
        EXPECT_EQ(0, MAVOEAFileEAWriteFlushTime(object_.c_str(), 0));
        EXPECT_EQ(Hex(one.stored), FlushTime());
    }
}

// Promise: "MAVOEAFileEAWriteFlushTime: Stamps"
// Promise: "Netatalk record: The **flush time**"
TEST_F(FinderInfoTest, TheFlushTimeIsThePresent) {
    Hooks().time = nullptr;
    const auto before = static_cast<std::uint32_t>(time(nullptr));
    EXPECT_EQ(0, MAVOEAFileEAWriteFlushTime(object_.c_str(), 0));
    const auto after = static_cast<std::uint32_t>(time(nullptr));
    const std::uint32_t stored = U32At(FlushTime(), 0);
    EXPECT_LE(stored - before, after - before);
}

TEST_F(FinderInfoTest, TheFlushTimeReplacesTheOneBeforeAndTouchesNothingElse) {
    SetRecord(AttributeRecord());
    ASSERT_EQ(0, setxattr(object_.c_str(), kTimeName, "123456789", 9, 0));
    EXPECT_EQ(0, MAVOEAFileEAWriteFlushTime(object_.c_str(), 0));
    EXPECT_EQ(Hex("12 34 56 78"), FlushTime());
    EXPECT_EQ(AttributeRecord(), Record());
    EXPECT_THAT(TakeCalls(), ElementsAre("time()", "setxattr(" + object_ +
                                                       ", user.mavo.filea.flushtime, 4, 0)"));
    EXPECT_FALSE(Exists(ea_dir_));
}

// Promise: "MAVOEAFileEAWriteFlushTime: 0x2A00"
TEST_F(FinderInfoTest, AFlushTimeThatCannotBeSetIsAFailure) {
    for (const int error : {EPERM, ENOSPC, ENOTSUP}) {
        const FailCall fault("setxattr", error);
        EXPECT_EQ(-1, MAVOEAFileEAWriteFlushTime(object_.c_str(), 0));
        EXPECT_EQ(error, errno);
        ExpectOnly(0x2A00, kFlushTime);
    }
    EXPECT_EQ(-1, MAVOEAFileEAWriteFlushTime(missing_.c_str(), 0));
    ExpectOnly(0x2A00, kFlushTime);
    ExpectNoAttributes();
}

// Promise: "MAVOEAFileEAWriteFlushTime: 0, or -1: 0xD00"
TEST_F(FinderInfoTest, NullIsABadArgumentToTheFlushTimeBeforeTheTypeIsAsked) {
    for (const int check : {0, 1, 2}) {
        EXPECT_EQ(-1, MAVOEAFileEAWriteFlushTime(nullptr, check));
        ExpectOnly(0xD00, kFlushTime);
    }
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

// Promise: "Finder info and flush time: With checkFSType 1"
TEST_F(FinderInfoTest, WithTheCheckTheFlushTimeIsForVolumesOfType2Only) {
    for (int type = -1; type <= 13; ++type) {
        SCOPED_TRACE(type);
        RemoveAttributes();
        Platform().fs_type = [type](const std::string&, int) { return type; };
        EXPECT_EQ(0, MAVOEAFileEAWriteFlushTime(object_.c_str(), 1));
        EXPECT_THAT(TakePlatformCalls(), ElementsAre("MAVOGetFSType(" + object_ + ", 1)"));
        EXPECT_EQ(type == 2 ? Hex("12 34 56 78") : Ascii("(none)"), FlushTime());
        for (const int check : {0, 2, -1}) {
            RemoveAttributes();
            EXPECT_EQ(0, MAVOEAFileEAWriteFlushTime(object_.c_str(), check));
            EXPECT_EQ(Hex("12 34 56 78"), FlushTime());
        }
        EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    }
}

}  // namespace
}  // namespace mavoea::test

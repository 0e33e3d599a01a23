// Netatalk records where volumes keep them: in an extended attribute, or at the head of the
// resource file.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <string>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"

namespace mavoea::test {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;

constexpr char kAttribute[] = "user.netatalk.Metadata";

class StorageTest : public ::testing::Test {
 protected:
    StorageTest() {
        ResetPlatform();
        ResetKernel();
        WriteFile(object_, Ascii("data"));
    }
    ~StorageTest() override {
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_THAT(TakeLog(), IsEmpty());
    }

    void SetAttribute(const Bytes& value) {
        ASSERT_EQ(0, setxattr(object_.c_str(), kAttribute, value.data(), value.size(), 0));
    }
    Bytes Attribute() const {
        Bytes value(2000);
        const ssize_t size = getxattr(object_.c_str(), kAttribute, value.data(), value.size());
        value.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
        return value;
    }
    void FillResourceFile(const Bytes& bytes) {
        mkdir((dir_ / "@eaDir").c_str(), 0777);
        WriteFile(resource_, bytes);
    }
    int ReadFileEA() { return MAVOEAFileEAAdoubleRead(object_.c_str(), &ad_); }
    int ReadEADir() { return MAVOEAEADirAdoubleRead(object_.c_str(), &ad_); }

    TempDir dir_;
    std::string object_ = dir_ / "object";
    std::string resource_ = dir_ / "@eaDir/object@MavoResource";
    EAAdouble ad_ = {};
};

// ---- The attribute
// -------------------------------------------------------------------------------

// Promise: "MAVOEAFileEAAdoubleRead: The record"
// Promise: "MAVOEAFileEAAdoubleRead: 0"
TEST_F(StorageTest, ARecordInTheAttributeIsRead) {
    SetAttribute(AttributeRecord());
    EXPECT_EQ(0, ReadFileEA());
    EXPECT_EQ(122, ad_.entries[9].offset);
    EXPECT_EQ(Pattern(32, 0x40), Bytes(ad_.data + 122, ad_.data + 154));
}

// Promise: "MAVOEAFileEAAdoubleRead: 1 there is none"
TEST_F(StorageTest, AnObjectWithoutTheAttributeHasNoRecord) {
    EXPECT_EQ(1, ReadFileEA());
    EXPECT_EQ(1, MAVOEAFileEAAdoubleRead((dir_ / "missing").c_str(), &ad_));
}

// Promise: "MAVOEAFileEAAdoubleRead: -1: 0xD00 NULL"
TEST_F(StorageTest, NullIsABadArgumentToTheReads) {
    EXPECT_EQ(-1, MAVOEAFileEAAdoubleRead(nullptr, &ad_));
    EXPECT_EQ(-1, MAVOEAFileEAAdoubleRead(object_.c_str(), nullptr));
    EXPECT_EQ(-1, MAVOEAEADirAdoubleRead(nullptr, &ad_));
    EXPECT_EQ(-1, MAVOEAEADirAdoubleRead(object_.c_str(), nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_fileafs_adouble_read"),
                                           RecordOf(0xD00, "ea_fileafs_adouble_read"),
                                           RecordOf(0xD00, "ea_eadirfs_adouble_read"),
                                           RecordOf(0xD00, "ea_eadirfs_adouble_read")));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// Promise: "MAVOEAFileEAAdoubleRead: and, logged, 0xA00"
TEST_F(StorageTest, AnAttributeOfAnotherSizeIsRefused) {
    Bytes record = AttributeRecord();
    record.resize(401);
    SetAttribute(record);
    EXPECT_EQ(-1, ReadFileEA());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_fileafs_adouble_read")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_fileafs_adouble_read:LINE Read size(401) != "
                                       "AD_DATASZZ_EA(402)"));
    record.resize(403);
    SetAttribute(record);
    EXPECT_EQ(-1, ReadFileEA());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_fileafs_adouble_read")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_fileafs_adouble_read:LINE Error: getxattr path [" +
                                       object_ + "] " + strerror(ERANGE)));
}

// Promise: "MAVOEAFileEAAdoubleRead: the code of MAVOEAAdoubleRead()"
TEST_F(StorageTest, AnAttributeThatDoesNotParseIsRefused) {
    Bytes record = AttributeRecord();
    record[0] = 1;
    SetAttribute(record);
    EXPECT_EQ(-1, ReadFileEA());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_adouble_read"),
                                           RecordOf(0xA00, "ea_fileafs_adouble_read")));
    const auto log = TakeLog();
    ASSERT_EQ(2u, log.size());
    EXPECT_EQ("ea_fileafs_adouble_read:LINE MAVOEAAdoubleRead failed", log[1]);
}

// Promise: "MAVOEAFileEAAdoubleRead: and, logged, 0xA00"
// Promise: "Netatalk record: The attribute has all"
TEST_F(StorageTest, AnAttributeHasItsEightEntries) {
    const Bytes whole = AttributeRecord();
    Bytes record = whole;
    PutU16(record, 24, 7);
    SetAttribute(record);
    EXPECT_EQ(-1, ReadFileEA());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_fileafs_adouble_read")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_fileafs_adouble_read:LINE Entry size[7] != "
                                       "ADEID_NUM_EA[8] or ad_entry error"));
    // Any of the eight that lies nowhere.
    for (std::size_t i = 0; i < 8; ++i) {
        SCOPED_TRACE(i);
        record = whole;
        PutU32(record, 26 + 12 * i + 4, 0);
        SetAttribute(record);
        ad_ = {};
        EXPECT_EQ(-1, ReadFileEA());
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_fileafs_adouble_read")));
        EXPECT_THAT(TakeLog(), ElementsAre("ea_fileafs_adouble_read:LINE Entry size[8] != "
                                           "ADEID_NUM_EA[8] or ad_entry error"));
    }
}

// Promise: "MAVOEAFileEAAdoubleRead: and, logged, 0xA00"
TEST_F(StorageTest, AFailedReadOfTheAttributeIsLogged) {
    const FailCall fault("getxattr", EIO);
    EXPECT_EQ(-1, ReadFileEA());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_fileafs_adouble_read")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_fileafs_adouble_read:LINE Error: getxattr path [" +
                                       object_ + "] " + strerror(EIO)));
}

// Promise: "Netatalk record: The AFP service's"
// Promise: "MAVOEAFileEAAdoubleFlush: Stores"
// Promise: "Netatalk record: An AppleDouble header"
TEST_F(StorageTest, ARecordIsStoredAsTheAttributeAndReplacesTheOneBefore) {
    SetAttribute(Repeat(9, 1000));
    const Bytes record = AttributeRecord();
    EXPECT_EQ(0, MAVOEAFileEAAdoubleFlush(record.data(), 402, object_.c_str()));
    EXPECT_EQ(record, Attribute());
    const Bytes largest = Repeat(3, 1024);
    EXPECT_EQ(0, MAVOEAFileEAAdoubleFlush(largest.data(), 1024, object_.c_str()));
    EXPECT_EQ(largest, Attribute());
}

// Promise: "MAVOEAFileEAAdoubleFlush: Stores"
// Promise: "MAVOEAFileEAAdoubleFlush: 0, or -1: 0xD00"
TEST_F(StorageTest, BadArgumentsToTheFlushesTouchNothing) {
    const Bytes block(1025);
    using Flush = int (*)(const void*, int, const char*);
    const std::pair<Flush, const char*> flushes[] = {
        {MAVOEAFileEAAdoubleFlush, "ea_fileeafs_flush"},
        {MAVOEAEADirAdoubleFlush, "ea_eadirfs_flush"}};
    for (const auto& [flush, unit] : flushes) {
        SCOPED_TRACE(unit);
        EXPECT_EQ(-1, flush(nullptr, 402, object_.c_str()));
        EXPECT_EQ(-1, flush(block.data(), -1, object_.c_str()));
        EXPECT_EQ(-1, flush(block.data(), 402, nullptr));
        EXPECT_EQ(-1, flush(block.data(), 1025, object_.c_str()));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, unit), RecordOf(0xD00, unit),
                                               RecordOf(0xD00, unit), RecordOf(0xD00, unit)));
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

// Promise: "MAVOEAFileEAAdoubleFlush: 0x300"
// Promise: "MAVOEAFileEAAdoubleFlush: 0xB00"
TEST_F(StorageTest, WhyTheAttributeCouldNotBeSetIsToldByTheCode) {
    const Bytes record = AttributeRecord();
    for (const auto& [error, code] : {std::pair{EPERM, 0x300}, {ENOSPC, 0xB00}, {EACCES, 0xB00}}) {
        const FailCall fault("setxattr", error);
        EXPECT_EQ(-1, MAVOEAFileEAAdoubleFlush(record.data(), 402, object_.c_str()));
        EXPECT_EQ(error, errno);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, "ea_fileeafs_flush")));
    }
}

// ---- The resource file
// ---------------------------------------------------------------------------

// Promise: "Netatalk record: The AFP service's"
// Promise: "MAVOEAFileEAAdoubleRead: The record"
// Promise: "MAVOEAFileEAAdoubleRead: 0"
// Promise: "Netatalk record: An AppleDouble header"
// Promise: "Netatalk record: the head of a resource file"
TEST_F(StorageTest, TheHeadOfAResourceFileIsRead) {
    const long before = OpenDescriptors();
    FillResourceFile(OneEntry(9, 100, 32) + Pattern(5000));
    EXPECT_EQ(0, ReadEADir());
    EXPECT_EQ(100, ad_.entries[9].offset);
    EXPECT_EQ(0, ad_.data[741]);  // What lies behind the head is no record.
    EXPECT_EQ(before, OpenDescriptors());
}

// Promise: "MAVOEAFileEAAdoubleRead: 1 there is none"
TEST_F(StorageTest, AShorterOrMissingResourceFileHasNoRecord) {
    EXPECT_EQ(1, ReadEADir());
    Bytes bytes = OneEntry(9, 100, 32);
    bytes.resize(740);
    FillResourceFile(bytes);
    EXPECT_EQ(1, ReadEADir());
    FillResourceFile({});
    EXPECT_EQ(1, ReadEADir());
    FillResourceFile(OneEntry(9, 100, 32));
    Hooks().opened = [this](int /*fd*/) { ASSERT_EQ(0, truncate(resource_.c_str(), 740)); };
    EXPECT_EQ(1, ReadEADir());
    Hooks().opened = nullptr;
}

// Not even where it cannot be read: of fewer bytes none is a record.
TEST_F(StorageTest, NothingIsReadOfAShorterResourceFile) {
    FillResourceFile(Pattern(740));
    TakeCalls();
    EXPECT_EQ(1, ReadEADir());
    EXPECT_THAT(TakeCalls(), Not(Contains(StartsWith("pread"))));
}

// Promise: "MAVOEAFileEAAdoubleRead: the code of MAVOEAAdoubleRead()"
TEST_F(StorageTest, AResourceFileThatDoesNotParseIsRefusedWithTheParsersCode) {
    FillResourceFile(OneEntry(9, 2000, 32));
    EXPECT_EQ(-1, ReadEADir());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_adouble_read")));
    const auto log = TakeLog();
    ASSERT_EQ(2u, log.size());
    EXPECT_EQ("ea_eadirfs_adouble_read:LINE EAAdoubleRead failed", log[1]);
}

// Promise: "MAVOEAFileEAAdoubleRead: and, logged, 0xA00"
// Promise: "MAVOEAFileEAAdoubleRead: 0x900"
TEST_F(StorageTest, AResourceFileThatCannotBeOpenedOrReadIsLogged) {
    FillResourceFile(OneEntry(9, 100, 32));
    {
        const FailCall fault("open", EACCES);
        EXPECT_EQ(-1, ReadEADir());
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_eadirfs_adouble_read")));
        EXPECT_THAT(TakeLog(), ElementsAre("ea_eadirfs_adouble_read:LINE Error: open path [" +
                                           object_ + "] " + strerror(EACCES)));
    }
    const FailCall fault("pread", EIO);
    EXPECT_EQ(-1, ReadEADir());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_eadirfs_adouble_read")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_eadirfs_adouble_read:LINE Error: read path [" + object_ +
                                       "] " + strerror(EIO)));
}

// Promise: "MAVOEAFileEAAdoubleRead: the path functions' codes"
// Promise: "MAVOEAFileEAAdoubleFlush: the path functions' codes"
TEST_F(StorageTest, APathThatIsTooLongIsLogged) {
    const std::string path = "/" + std::string(4090, 'p');
    const Bytes block(741);
    EXPECT_EQ(-1, MAVOEAEADirAdoubleRead(path.c_str(), &ad_));
    EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, path.c_str()));
    EXPECT_THAT(TakeRecords(),
                ElementsAre(RecordOf(0xC300, "ea_path"), RecordOf(0xC300, "ea_path")));
    EXPECT_THAT(TakeLog(),
                ElementsAre("ea_eadirfs_adouble_read:LINE Fail to generate path of " + path + ".",
                            "ea_eadirfs_flush:LINE Fail to generate path of " + path + "."));
}

// Promise: "MAVOEAFileEAAdoubleFlush: of one that exists"
TEST_F(StorageTest, OnlyTheHeadOfAResourceFileIsReplaced) {
    const Bytes before = Pattern(5000);
    FillResourceFile(before);
    const Bytes block = OneEntry(9, 100, 32);
    EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
    EXPECT_EQ(block + Bytes(before.begin() + 741, before.end()), ReadFile(resource_));
}

// Promise: "MAVOEAFileEAAdoubleFlush: The resource file"
// Promise: "Where metadata lies: `D/@eaDir/N@MavoResource`"
TEST_F(StorageTest, AMissingResourceFileIsCreated) {
    mkdir((dir_ / "@eaDir").c_str(), 0777);
    const Umask umask(022);
    const Bytes block = Repeat(5, 1024);
    EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block.data(), 1024, object_.c_str()));
    EXPECT_EQ(block, ReadFile(resource_));
    EXPECT_EQ(0755, ModeOf(resource_));
}

// Promise: "MAVOEAFileEAAdoubleFlush: MAVOEAEADirAdoubleFlush()"
TEST_F(StorageTest, EveryFlushKeepsTheDescriptorThatItOpened) {
    FillResourceFile(Pattern(800));
    const Bytes block(741);
    const long before = OpenDescriptors();
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
    }
    EXPECT_EQ(before + 3, OpenDescriptors());
}

// Promise: "MAVOEAFileEAAdoubleFlush: and, logged, 0x900"
// Promise: "MAVOEAFileEAAdoubleFlush: Its EA directory is not made"
TEST_F(StorageTest, AResourceFileThatCouldNotBeMadeOrOpenedIsLogged) {
    const Bytes block(741);
    // There is no EA directory to make it in.
    EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_FALSE(Exists(dir_ / "@eaDir"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_eadirfs_flush")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_eadirfs_flush:LINE Error open path [" + object_ + "] " +
                                       strerror(ENOENT)));
    const FailCall fault("open", EACCES);
    EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_eadirfs_flush")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_eadirfs_flush:LINE Error open path [" + object_ + "] " +
                                       strerror(EACCES)));
}

// Promise: "MAVOEAFileEAAdoubleFlush: 0xB00"
// Promise: "MAVOEAFileEAAdoubleFlush: The resource file"
TEST_F(StorageTest, AFailedWriteRemovesTheFileThatItMadeAndNoOther) {
    mkdir((dir_ / "@eaDir").c_str(), 0777);
    const Bytes block = Repeat(1, 741);
    for (const bool existed : {false, true}) {
        SCOPED_TRACE(existed);
        if (existed) WriteFile(resource_, Pattern(900));
        {
            const FailCall fault("pwrite", ENOSPC);
            EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
        }
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xB00, "ea_eadirfs_flush")));
        EXPECT_THAT(TakeLog(), ElementsAre("ea_eadirfs_flush:LINE Error: write path [" + object_ +
                                           "] " + strerror(ENOSPC)));
        EXPECT_EQ(existed, Exists(resource_));
    }
    EXPECT_EQ(Pattern(900), ReadFile(resource_));
}

TEST_F(StorageTest, AFileThatHasTakenThePlaceOfTheOneThatItMadeIsNotRemoved) {
    mkdir((dir_ / "@eaDir").c_str(), 0777);
    const Bytes block = Repeat(1, 741);
    Hooks().before = [&](const std::string& name) {
        if (name != "pwrite") return;
        ASSERT_EQ(0, rename(resource_.c_str(), (dir_ / "former").c_str()));
        WriteFile(resource_, Pattern(900));
    };
    const FailCall fault("pwrite", ENOSPC);
    EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
    EXPECT_EQ(ENOSPC, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xB00, "ea_eadirfs_flush")));
    EXPECT_EQ(1u, TakeLog().size());
    EXPECT_EQ(Pattern(900), ReadFile(resource_));
}

TEST_F(StorageTest, AFileThatComesAndGoesIsMadeNevertheless) {
    mkdir((dir_ / "@eaDir").c_str(), 0777);
    const Bytes block = Repeat(1, 741);
    int opens = 0;
    Hooks().before = [&](const std::string& name) {
        if (name != "open") return;
        ++opens;
        if (opens == 2) WriteFile(resource_, Pattern(900));
        if (opens == 3) unlink(resource_.c_str());
    };
    EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
    EXPECT_EQ(4, opens);
    EXPECT_EQ(block, ReadFile(resource_));
}

TEST_F(StorageTest, AShortWriteIsAFailedOne) {
    FillResourceFile(Pattern(900));
    const Bytes block = Repeat(1, 741);
    const ShortCall fault("pwrite", 1, 700);
    EXPECT_EQ(-1, MAVOEAEADirAdoubleFlush(block.data(), 741, object_.c_str()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xB00, "ea_eadirfs_flush")));
    EXPECT_EQ(1u, TakeLog().size());
}

}  // namespace
}  // namespace mavoea::test

// The hidden and locked bits as a host keeps them: what FileCommand() sets, MLIBCFileStat() shows.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cstdint>
#include <string>

#include "platform/include/mavocore.h"
#include "platform/marks.h"
#include "tests/platform/support/private_mounts.h"
#include "tests/support/process.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using marks::FileCommand;

constexpr char kAttribute[] = "user.mavo.attributes";
constexpr char kDosAttribute[] = "user.DOSATTRIB";

// The commands, by the numbers that the platform's kernel knows.
constexpr int kHide = 0x203;
constexpr int kShow = 0x206;
constexpr int kUnlock = 521;
constexpr int kLock = 522;

constexpr std::uint32_t kArchive = 0x1;
constexpr std::uint32_t kHidden = 0x4;
constexpr std::uint32_t kLocked = 0x20;

class FileMarksTest : public ::testing::Test {
 protected:
    FileMarksTest() { WriteFile(path_, Ascii("content")); }

    void SetUp() override {
        const Bytes bytes = Hex("01");
        if (setxattr(path_.c_str(), "user.probe", bytes.data(), bytes.size(), 0) != 0) {
            GTEST_SKIP() << "no user attributes on this filesystem";
        }
    }

    int Command(int command) const { return FileCommand(path_.c_str(), command); }

    static std::uint32_t WordOf(const std::string& path) {
        unsigned char info[128];
        EXPECT_EQ(0, MLIBCFileStat(path.c_str(), 3, info)) << strerror(errno);
        std::uint32_t word;
        memcpy(&word, info + 116, sizeof word);
        return word;
    }
    std::uint32_t Word() const { return WordOf(path_); }

    void Store(const Bytes& bytes) const {
        ASSERT_EQ(0, setxattr(path_.c_str(), kAttribute, bytes.data(), bytes.size(), 0));
    }
    static Bytes StoredIn(const std::string& path, const char* attribute = kAttribute) {
        Bytes bytes(1024);
        const ssize_t size = getxattr(path.c_str(), attribute, bytes.data(), bytes.size());
        if (size < 0) return Ascii(errno == ENODATA ? "(none)" : "(not read)");
        bytes.resize(static_cast<std::size_t>(size));
        return bytes;
    }
    Bytes Stored() const { return StoredIn(path_); }

    void StoreDos(const Bytes& bytes) const {
        ASSERT_EQ(0, setxattr(path_.c_str(), kDosAttribute, bytes.data(), bytes.size(), 0));
    }
    Bytes StoredDos() const { return StoredIn(path_, kDosAttribute); }

    int Archive() const { return marks::SetArchiveBit(path_.c_str()); }

    const TempDir dir_;
    const std::string path_ = dir_ / "a";
};

TEST_F(FileMarksTest, TheCommandsHaveThePlatformsNumbers) {
    EXPECT_EQ(403, marks::kFileCommandCall);
    EXPECT_EQ(kHide, marks::kSetHidden);
    EXPECT_EQ(kShow, marks::kClearHidden);
    EXPECT_EQ(kLock, marks::kSetLocked);
    EXPECT_EQ(kUnlock, marks::kClearLocked);
}

TEST_F(FileMarksTest, LockingSetsTheLockedBitAndUnlockingClearsIt) {
    EXPECT_EQ(0, Command(kLock));
    EXPECT_EQ(kLocked, Word());
    EXPECT_EQ(Hex("00 00 00 20"), Stored());
    EXPECT_EQ(0, Command(kUnlock));
    EXPECT_EQ(0u, Word());
}

TEST_F(FileMarksTest, HidingSetsTheHiddenBitAndShowingClearsIt) {
    EXPECT_EQ(0, Command(kHide));
    EXPECT_EQ(kHidden, Word());
    EXPECT_EQ(Hex("00 00 00 04"), Stored());
    EXPECT_EQ(0, Command(kShow));
    EXPECT_EQ(0u, Word());
}

// Promise: "Attribute word: A host whose"
TEST_F(FileMarksTest, BothBitsLiveSideBySide) {
    EXPECT_EQ(0, Command(kHide));
    EXPECT_EQ(0, Command(kLock));
    EXPECT_EQ(kHidden | kLocked, Word());
    EXPECT_EQ(0, Command(kShow));
    EXPECT_EQ(kLocked, Word());
    EXPECT_EQ(0, Command(kHide));
    EXPECT_EQ(0, Command(kUnlock));
    EXPECT_EQ(kHidden, Word());
}

TEST_F(FileMarksTest, WhatIsSoAlreadyStaysSo) {
    for (const int command : {kLock, kLock, kHide, kHide}) EXPECT_EQ(0, Command(command));
    EXPECT_EQ(kHidden | kLocked, Word());
    for (const int command : {kUnlock, kUnlock, kShow, kShow}) EXPECT_EQ(0, Command(command));
    EXPECT_EQ(0u, Word());
}

TEST_F(FileMarksTest, ClearingWhatWasNeverSetMakesNoAttribute) {
    EXPECT_EQ(0, Command(kUnlock));
    EXPECT_EQ(0, Command(kShow));
    EXPECT_EQ(Ascii("(none)"), Stored());
}

TEST_F(FileMarksTest, AllOtherBitsAreKept) {
    struct Case {
        int command;
        const char* before;
        const char* after;
    };
    constexpr Case kCases[] = {
        {kLock, "12 34 56 01", "12 34 56 21"},   {kHide, "12 34 56 01", "12 34 56 05"},
        {kUnlock, "FF FF FF FF", "FF FF FF DF"}, {kShow, "FF FF FF FF", "FF FF FF FB"},
        {kUnlock, "12 34 56 01", "12 34 56 01"}, {kShow, "12 34 56 01", "12 34 56 01"},
        {kLock, "00 20 00 00", "00 20 00 20"},   {kHide, "04 00 00 00", "04 00 00 04"},
    };
    for (const Case& one : kCases) {
        SCOPED_TRACE(testing::Message() << one.command << " on " << one.before);
        Store(Hex(one.before));
        EXPECT_EQ(0, Command(one.command));
        EXPECT_EQ(Hex(one.after), Stored());
    }
}

TEST_F(FileMarksTest, AWordOfAnotherSizeCountsAsNoneAndIsReplacedOnlyByABit) {
    for (const char* bytes : {"", "25", "00 00 25", "00 00 00 00 25"}) {
        SCOPED_TRACE(bytes);
        Store(Hex(bytes));
        EXPECT_EQ(0, Command(kUnlock));
        EXPECT_EQ(Hex(bytes), Stored());
        EXPECT_EQ(0, Command(kLock));
        EXPECT_EQ(Hex("00 00 00 20"), Stored());
    }
}

TEST_F(FileMarksTest, ADirectoryHasMarksToo) {
    EXPECT_EQ(0, FileCommand(dir_.path().c_str(), kLock));
    EXPECT_EQ(kLocked, WordOf(dir_.path()));
    EXPECT_EQ(0u, Word());
}

TEST_F(FileMarksTest, ASymbolicLinkIsFollowed) {
    ASSERT_EQ(0, symlink("a", (dir_ / "link").c_str()));
    EXPECT_EQ(0, FileCommand((dir_ / "link").c_str(), kLock));
    EXPECT_EQ(kLocked, Word());
}

TEST_F(FileMarksTest, TheContentAndTheModeStay) {
    ASSERT_EQ(0, chmod(path_.c_str(), 0640));
    EXPECT_EQ(0, Command(kLock));
    EXPECT_EQ(0640, ModeOf(path_));
    EXPECT_EQ(Ascii("content"), ReadFile(path_));
}

// Promise: "Attribute word: A host whose"
TEST_F(FileMarksTest, TheArchiveBitIsKeptInTheSameWord) {
    EXPECT_EQ(0, Command(kLock));
    const int fd = open(path_.c_str(), O_RDONLY);
    ASSERT_LE(0, fd);
    EXPECT_EQ(0, marks::SetArchiveBit(fd));
    close(fd);
    EXPECT_EQ(0x21u, Word());
    EXPECT_EQ(0, Command(kUnlock));
    EXPECT_EQ(0x1u, Word());
}

// Once the kernel has said that it does not know the call, it is set by the path alone.
TEST_F(FileMarksTest, TheArchiveBitIsSetByPathTooWhereALinkLeadsAndWhoeverIsAskedFirst) {
    const std::string link = dir_ / "link";
    ASSERT_EQ(0, symlink("a", link.c_str()));
    ASSERT_EQ(0, mkfifo((dir_ / "fifo").c_str(), 0777));
    ASSERT_EQ(0, mkdir((dir_ / "folder").c_str(), 0777));
    for (int i = 0; i < 3; ++i) {
        SCOPED_TRACE(i);
        (void)removexattr(path_.c_str(), kAttribute);
        EXPECT_EQ(0, Command(kHide));
        EXPECT_EQ(0, marks::SetArchiveBit(link.c_str()));
        EXPECT_EQ(0x5u, Word());
        EXPECT_EQ(0, marks::SetArchiveBit((dir_ / "folder").c_str()));
        EXPECT_EQ(0x1u, WordOf(dir_ / "folder"));
        EXPECT_EQ(-1, marks::SetArchiveBit((dir_ / "fifo").c_str()));
        errno = 0;
        EXPECT_EQ(-1, marks::SetArchiveBit((dir_ / "none").c_str()));
        EXPECT_EQ(ENOENT, errno);
    }
    EXPECT_EQ(Ascii("content"), ReadFile(path_));
}

TEST_F(FileMarksTest, WhoMayNotReadAFileDoesNotSetItsArchiveBit) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    ASSERT_EQ(0, chmod(dir_.path().c_str(), 0755));
    ASSERT_EQ(0, chmod(path_.c_str(), 0222));
    AsUser(65534, Root::kGivenUp, [this] {
        for (int i = 0; i < 3; ++i) {
            errno = 0;
            EXPECT_EQ(-1, marks::SetArchiveBit(path_.c_str()));
            EXPECT_EQ(EACCES, errno);
            // By then the kernel has been asked.
            const std::string other = "/proc/self/exe";
            (void)marks::SetArchiveBit(other.c_str());
        }
    });
    EXPECT_EQ(Ascii("(none)"), Stored());
}

// ---- Files of Samba's shares --------------------------------------------------------------------

// DOS attributes of each version, with read-only and system, and what else is kept in place.
struct DosVersion {
    const char* before;
    std::size_t attributes_at;
};
constexpr DosVersion kDosVersions[] = {
    {"'0x05' 00 00 01 00 01 00 00 00 05 00 00 00 44 33 22 11 08 07 06 05 04 03 02 01 "
     "18 17 16 15 14 13 12 11 28 DA 02 22 13 79 DD 01 28 27 26 25 24 23 22 21",
     12},
    {"'0x05' 00 00 02 00 02 00 00 00 BB AA 00 00 05 00 00 00 44 33 22 11 "
     "08 07 06 05 04 03 02 01 18 17 16 15 14 13 12 11 28 DA 02 22 13 79 DD 01 "
     "28 27 26 25 24 23 22 21 48 47 46 45 44 43 42 41 'n' 00",
     16},
    {"'0x05' 00 00 03 00 03 00 00 00 11 00 00 00 05 00 00 00 44 33 22 11 "
     "08 07 06 05 04 03 02 01 18 17 16 15 14 13 12 11 28 DA 02 22 13 79 DD 01 "
     "28 27 26 25 24 23 22 21",
     16},
    {"00 00 04 00 04 00 00 00 11 00 00 00 05 00 00 00 08 07 06 05 04 03 02 01 "
     "28 DA 02 22 13 79 DD 01",
     12},
    {"00 00 05 00 05 00 00 00 11 00 00 00 05 00 00 00 28 DA 02 22 13 79 DD 01", 12},
};

// Promise: "Attribute word: Where an object"
TEST_F(FileMarksTest, DosAttributesAreChangedInPlaceAndSayWhatIsHiddenAndToBeArchived) {
    for (const DosVersion& version : kDosVersions) {
        SCOPED_TRACE(version.before);
        (void)removexattr(path_.c_str(), kAttribute);
        Bytes dos = Hex(version.before);
        StoreDos(dos);
        EXPECT_EQ(0u, Word());
        EXPECT_EQ(0, Command(kHide));
        dos[version.attributes_at] = 0x07;
        EXPECT_EQ(dos, StoredDos());
        EXPECT_EQ(Hex("00 00 00 04"), Stored());
        EXPECT_EQ(0, Archive());
        dos[version.attributes_at] = 0x27;
        EXPECT_EQ(dos, StoredDos());
        EXPECT_EQ(kHidden | kArchive, Word());
        EXPECT_EQ(0, Command(kLock));
        EXPECT_EQ(dos, StoredDos());
        EXPECT_EQ(kHidden | kArchive | kLocked, Word());
        EXPECT_EQ(0, Command(kShow));
        dos[version.attributes_at] = 0x25;
        EXPECT_EQ(dos, StoredDos());
        EXPECT_EQ(kArchive | kLocked, Word());
        EXPECT_EQ(Hex("00 00 00 21"), Stored());
    }
}

TEST_F(FileMarksTest, WhatAClientHasChangedCountsAndNotTheWordOfBefore) {
    Store(Hex("80 00 00 05"));
    StoreDos(Hex("00 00 05 00 05 00 00 00 11 00 00 00 01 00 00 00 28 DA 02 22 13 79 DD 01"));
    EXPECT_EQ(0x80000000u, Word());
    EXPECT_EQ(0, Command(kShow));
    EXPECT_EQ(Hex("80 00 00 01"), Stored());
    StoreDos(Hex("00 00 05 00 05 00 00 00 11 00 00 00 22 00 00 00 28 DA 02 22 13 79 DD 01"));
    EXPECT_EQ(0x80000005u, Word());
    EXPECT_EQ(0, Archive());
    EXPECT_EQ(Hex("80 00 00 01"), Stored());
}

TEST_F(FileMarksTest, AttributesAsATextBecomeOnesOfTheCurrentVersion) {
    StoreDos(Ascii("0x2"));
    EXPECT_EQ(kHidden, Word());
    EXPECT_EQ(0, Command(kHide));
    EXPECT_EQ(Ascii("0x2"), StoredDos());
    EXPECT_EQ(0, Archive());
    EXPECT_EQ(Hex("00 00 05 00 05 00 00 00 01 00 00 00 22 00 00 00 00 00 00 00 00 00 00 00"),
              StoredDos());
}

TEST_F(FileMarksTest, NobodyGetsDosAttributes) {
    for (const int command : {kHide, kLock, kShow, kUnlock}) EXPECT_EQ(0, Command(command));
    EXPECT_EQ(0, Archive());
    EXPECT_EQ(Ascii("(none)"), StoredDos());
}

// Samba reads 256 bytes at most.
TEST_F(FileMarksTest, DosAttributesThatAreNotUnderstoodCountAsNoneAndStay) {
    const Bytes whole =
        Hex("00 00 05 00 05 00 00 00 11 00 00 00 02 00 00 00 28 DA 02 22 13 79 DD 01");
    Bytes longest = whole;
    longest.resize(256);
    StoreDos(longest);
    EXPECT_EQ(kHidden, Word());
    Bytes longer = whole;
    longer.resize(257);
    std::vector<Bytes> values = {longer, Bytes(256, 0xFF), Bytes(1000, '2'), Ascii("x2")};
    for (std::size_t size = 0; size < whole.size(); ++size) {
        values.emplace_back(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size));
    }
    for (const Bytes& value : values) {
        SCOPED_TRACE(value.size());
        StoreDos(value);
        (void)removexattr(path_.c_str(), kAttribute);
        EXPECT_EQ(0u, Word());
        EXPECT_EQ(0, Command(kHide));
        EXPECT_EQ(0, Archive());
        EXPECT_EQ(kHidden | kArchive, Word());
        EXPECT_EQ(value, StoredDos());
    }
}

TEST_F(FileMarksTest, NoByteOfDosAttributesIsToBeFeared) {
    for (const DosVersion& version : kDosVersions) {
        const Bytes whole = Hex(version.before);
        for (std::size_t at = 0; at < whole.size(); ++at) {
            for (unsigned byte = 0; byte < 256; ++byte) {
                Bytes value = whole;
                value[at] = static_cast<std::uint8_t>(byte);
                StoreDos(value);
                ASSERT_EQ(0, Command(kHide)) << at << ": " << byte;
                ASSERT_EQ(kHidden, Word() & kHidden) << at << ": " << byte;
                ASSERT_EQ(0, Command(kShow)) << at << ": " << byte;
                ASSERT_EQ(0u, Word() & kHidden) << at << ": " << byte;
            }
        }
    }
}

TEST_F(FileMarksTest, AnUnknownCommandIsRefusedAndChangesNothing) {
    for (const int command : {0, -1, 1, 0x202, 0x204, 0x205, 0x207, 520, 523}) {
        SCOPED_TRACE(command);
        errno = 0;
        EXPECT_EQ(-1, Command(command));
        EXPECT_EQ(EINVAL, errno);
        EXPECT_EQ(Ascii("(none)"), Stored());
    }
}

TEST_F(FileMarksTest, AMissingFileIsAFailureForEveryCommand) {
    for (const int command : {kLock, kUnlock, kHide, kShow}) {
        SCOPED_TRACE(command);
        errno = 0;
        EXPECT_EQ(-1, FileCommand((dir_ / "none").c_str(), command));
        EXPECT_EQ(ENOENT, errno);
        EXPECT_FALSE(Exists(dir_ / "none"));
    }
}

TEST_F(FileMarksTest, AFilesystemWithoutAttributesRefusesToMark) {
    errno = 0;
    EXPECT_EQ(-1, FileCommand("/proc/self/status", kLock));  // procfs has none
    EXPECT_EQ(ENOTSUP, errno);
}

TEST_F(FileMarksTest, AFileOfAnotherUserCannotBeMarkedWithoutTheRight) {
    ASSERT_EQ(0, chmod(path_.c_str(), 0644));
    ASSERT_EQ(0, chmod(dir_.path().c_str(), 0755));
    int result = 0;
    int error = 0;
    {
        const AsNobody nobody;
        if (!nobody.ok()) GTEST_SKIP() << "needs the superuser";
        errno = 0;
        result = Command(kLock);
        error = errno;
    }
    EXPECT_EQ(-1, result);
    EXPECT_EQ(EACCES, error);
    EXPECT_EQ(Ascii("(none)"), Stored());
}

}  // namespace
}  // namespace mavoea::test

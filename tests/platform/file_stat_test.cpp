// Extended stat: the two fields and where they are.

#include <errno.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cstdint>
#include <string>

#include "platform/include/mavocore.h"
#include "tests/platform/support/private_mounts.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

constexpr char kAttribute[] = "user.mavo.attributes";

class FileStatTest : public ::testing::Test {
 protected:
    FileStatTest() {
        WriteFile(path_, Ascii("content"));
        memset(info_, 0xAA, sizeof info_);
    }

    // False when the filesystem of the temporary directory keeps no such attributes.
    bool SetWord(const Bytes& bytes) {
        return setxattr(path_.c_str(), kAttribute, bytes.data(), bytes.size(), 0) == 0;
    }

    std::uint32_t FieldAt(std::size_t offset) const {
        std::uint32_t value;
        memcpy(&value, info_ + offset, sizeof value);
        return value;
    }

    void ExpectUntouched() const {
        for (unsigned char byte : info_) ASSERT_EQ(0xAA, byte);
    }

    const TempDir dir_;
    const std::string path_ = dir_ / "a";
    unsigned char info_[132];  // 128, and 4 to see whether they stay
};

TEST_F(FileStatTest, TheModeIsAtByte16AndAllOtherBytesAre0) {
    ASSERT_EQ(0, chmod(path_.c_str(), 04751));
    errno = ERANGE;
    ASSERT_EQ(0, MLIBCFileStat(path_.c_str(), 3, info_));
    EXPECT_EQ(ERANGE, errno);
    EXPECT_EQ(0104751u, FieldAt(16));
    for (std::size_t i = 0; i < 128; ++i) {
        if (i < 16 || i >= 20) {
            ASSERT_EQ(0, info_[i]) << i;
        }
    }
    EXPECT_EQ(0xAAAAAAAAu, FieldAt(128));
}

TEST_F(FileStatTest, ADirectoryHasItsMode) {
    ASSERT_EQ(0, chmod(dir_.path().c_str(), 0711));
    ASSERT_EQ(0, MLIBCFileStat(dir_.path().c_str(), 3, info_));
    EXPECT_EQ(0040711u, FieldAt(16));
}

TEST_F(FileStatTest, TheAttributeWordIsAtByte116) {
    if (!SetWord(Hex("12 34 56 25"))) GTEST_SKIP() << "no user attributes on this filesystem";
    ASSERT_EQ(0, MLIBCFileStat(path_.c_str(), 3, info_));
    EXPECT_EQ(0x12345625u, FieldAt(116));
    EXPECT_EQ(0100000u, FieldAt(16) & 0170000u);
    for (std::size_t i = 20; i < 128; ++i) {
        if (i < 116 || i >= 120) {
            ASSERT_EQ(0, info_[i]) << i;
        }
    }
}

TEST_F(FileStatTest, TheBitsAreThoseOfTheHeader) {
    if (!SetWord(Hex("00 00 00 25"))) GTEST_SKIP() << "no user attributes on this filesystem";
    ASSERT_EQ(0, MLIBCFileStat(path_.c_str(), 3, info_));
    EXPECT_EQ(
        std::uint32_t{MLIBC_ATTRIBUTE_ARCHIVE | MLIBC_ATTRIBUTE_HIDDEN | MLIBC_ATTRIBUTE_LOCKED},
        FieldAt(116));
}

TEST_F(FileStatTest, AWordOfAnotherSizeIsNone) {
    for (const char* bytes : {"", "25", "00 00 25", "00 00 00 00 25"}) {
        SCOPED_TRACE(bytes);
        if (!SetWord(Hex(bytes))) GTEST_SKIP() << "no user attributes on this filesystem";
        ASSERT_EQ(0, MLIBCFileStat(path_.c_str(), 3, info_));
        EXPECT_EQ(0u, FieldAt(116));
    }
}

TEST_F(FileStatTest, EveryOptionIsTaken) {
    for (int option : {-1, 0, 3, 1000}) EXPECT_EQ(0, MLIBCFileStat(path_.c_str(), option, info_));
}

TEST_F(FileStatTest, ASymbolicLinkIsFollowed) {
    const bool marked = SetWord(Hex("00 00 00 20"));
    ASSERT_EQ(0, chmod(path_.c_str(), 0640));
    ASSERT_EQ(0, symlink("a", (dir_ / "link").c_str()));
    ASSERT_EQ(0, MLIBCFileStat((dir_ / "link").c_str(), 3, info_));
    EXPECT_EQ(0100640u, FieldAt(16));
    EXPECT_EQ(marked ? 0x20u : 0u, FieldAt(116));
}

TEST_F(FileStatTest, WhereAttributesAreUnknownTheWordIs0) {
    ASSERT_EQ(0, MLIBCFileStat("/proc/self/status", 3, info_));  // procfs has none
    EXPECT_EQ(0100444u, FieldAt(16));
    EXPECT_EQ(0u, FieldAt(116));

    const std::string fifo = dir_ / "fifo";  // nor has anything but files and directories
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));
    ASSERT_EQ(0, MLIBCFileStat(fifo.c_str(), 3, info_));
    EXPECT_EQ(0010600u, FieldAt(16));
}

TEST_F(FileStatTest, AMissingFileIsAFailure) {
    errno = 0;
    EXPECT_EQ(-1, MLIBCFileStat((dir_ / "none").c_str(), 3, info_));
    EXPECT_EQ(ENOENT, errno);
    ExpectUntouched();
}

TEST_F(FileStatTest, AWordThatMayNotBeReadIsAFailureAndNot0) {
    if (!SetWord(Hex("00 00 00 20"))) GTEST_SKIP() << "no user attributes on this filesystem";
    ASSERT_EQ(0, chmod(path_.c_str(), 0600));
    int result = 0;
    int error = 0;
    {
        const AsNobody nobody;
        if (!nobody.ok()) GTEST_SKIP() << "needs the superuser";
        errno = 0;
        result = MLIBCFileStat(path_.c_str(), 3, info_);
        error = errno;
    }
    EXPECT_EQ(-1, result);
    EXPECT_EQ(EACCES, error);
    ExpectUntouched();
}

TEST_F(FileStatTest, NullArgumentsAreRefused) {
    errno = 0;
    EXPECT_EQ(-1, MLIBCFileStat(nullptr, 3, info_));
    EXPECT_EQ(EINVAL, errno);
    errno = 0;
    EXPECT_EQ(-1, MLIBCFileStat(path_.c_str(), 3, nullptr));
    EXPECT_EQ(EINVAL, errno);
}

}  // namespace
}  // namespace mavoea::test

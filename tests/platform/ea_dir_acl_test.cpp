// The ACL of EA directories, as libacl, getfacl and the kernel see it.

#include <acl/libacl.h>
#include <errno.h>
#include <gtest/gtest.h>
#include <sys/acl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cstdio>
#include <memory>
#include <string>

#include "platform/include/mavoacl.h"
#include "platform/include/mavocore.h"
#include "tests/platform/support/private_mounts.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

// The default ACL in text, "" for none.
std::string DefaultAclOf(const std::string& path) {
    const acl_t acl = acl_get_file(path.c_str(), ACL_TYPE_DEFAULT);
    if (acl == nullptr) return "";
    char* const text = acl_to_any_text(acl, nullptr, ',', TEXT_ABBREVIATE);
    const std::string result = text == nullptr ? "?" : text;
    acl_free(text);
    acl_free(acl);
    return result;
}

int LowestFreeDescriptor() {
    const int fd = dup(0);
    close(fd);
    return fd;
}

class EaDirAclTest : public ::testing::Test {
 protected:
    void SetUp() override {
        const TempDir probe;
        const acl_t acl = acl_from_text("u::rwx,g::rwx,o::rwx");
        const bool kept = acl_set_file(probe.path().c_str(), ACL_TYPE_DEFAULT, acl) == 0;
        acl_free(acl);
        if (!kept) GTEST_SKIP() << "the temporary directory's filesystem has no ACLs";
        ASSERT_EQ(0, mkdir(ea_dir_.c_str(), 0777));
    }

    const TempDir dir_;
    const std::string ea_dir_ = dir_ / "@eaDir";
};

TEST_F(EaDirAclTest, TheDefaultAclLetsEveryUserUseWhatIsMadeInside) {
    errno = ERANGE;
    ASSERT_EQ(0, MAVOACLSetEADirACL(ea_dir_.c_str()));
    EXPECT_EQ(ERANGE, errno);
    EXPECT_EQ("u::rwx,g::rwx,o::rwx", DefaultAclOf(ea_dir_));
}

TEST_F(EaDirAclTest, TheKernelHoldsTheseBytes) {
    ASSERT_EQ(0, MAVOACLSetEADirACL(ea_dir_.c_str()));
    Bytes bytes(256);
    const ssize_t size = getxattr(ea_dir_.c_str(), "system.posix_acl_default", bytes.data(), 256);
    ASSERT_LT(0, size);
    bytes.resize(static_cast<std::size_t>(size));
    EXPECT_EQ(Hex("02 00 00 00"                // version, little-endian everywhere
                  "01 00 07 00 FF FF FF FF"    // user::rwx
                  "04 00 07 00 FF FF FF FF"    // group::rwx
                  "20 00 07 00 FF FF FF FF"),  // other::rwx
              bytes);
}

TEST_F(EaDirAclTest, GetfaclShowsIt) {
    if (access("/usr/bin/getfacl", X_OK) != 0) GTEST_SKIP() << "getfacl is not installed";
    ASSERT_EQ(0, MAVOACLSetEADirACL(ea_dir_.c_str()));
    const std::string out = dir_ / "out";
    ASSERT_EQ(0, MLIBCExec("/bin/sh", "-c", "/usr/bin/getfacl -cdp \"$0\" >\"$1\"", ea_dir_.c_str(),
                           out.c_str(), static_cast<char*>(nullptr)));
    const Bytes text = ReadFile(out);
    EXPECT_EQ("user::rwx\ngroup::rwx\nother::rwx\n\n", std::string(text.begin(), text.end()));
}

TEST_F(EaDirAclTest, WhatIsMadeInsideDoesNotMindTheUmask) {
    ASSERT_EQ(0, MAVOACLSetEADirACL(ea_dir_.c_str()));
    const mode_t before = umask(077);
    std::FILE* const file = std::fopen((ea_dir_ + "/file").c_str(), "w");
    const int made = mkdir((ea_dir_ + "/a").c_str(), 0777);
    umask(before);
    ASSERT_NE(nullptr, file);
    std::fclose(file);
    ASSERT_EQ(0, made);
    EXPECT_EQ(0666, ModeOf(ea_dir_ + "/file"));
    EXPECT_EQ(0777, ModeOf(ea_dir_ + "/a"));
    EXPECT_EQ("u::rwx,g::rwx,o::rwx", DefaultAclOf(ea_dir_ + "/a"));
}

TEST_F(EaDirAclTest, TheModeOfTheDirectoryStays) {
    ASSERT_EQ(0, chmod(ea_dir_.c_str(), 0750));
    ASSERT_EQ(0, MAVOACLSetEADirACL(ea_dir_.c_str()));
    EXPECT_EQ(0750, ModeOf(ea_dir_));
}

TEST_F(EaDirAclTest, AnAclThatWasThereIsReplaced) {
    const acl_t acl = acl_from_text("u::rwx,g::---,o::---");
    ASSERT_EQ(0, acl_set_file(ea_dir_.c_str(), ACL_TYPE_DEFAULT, acl));
    acl_free(acl);
    ASSERT_EQ(0, MAVOACLSetEADirACL(ea_dir_.c_str()));
    EXPECT_EQ("u::rwx,g::rwx,o::rwx", DefaultAclOf(ea_dir_));
}

TEST_F(EaDirAclTest, ASymbolicLinkIsNotFollowed) {
    const std::string link = dir_ / "link";
    ASSERT_EQ(0, symlink(ea_dir_.c_str(), link.c_str()));
    errno = 0;
    EXPECT_EQ(-1, MAVOACLSetEADirACL(link.c_str()));
    EXPECT_TRUE(errno == ENOTDIR || errno == ELOOP) << errno;
    EXPECT_EQ("", DefaultAclOf(ea_dir_));
}

TEST_F(EaDirAclTest, WhatIsNoDirectoryIsAFailure) {
    WriteFile(dir_ / "file", {});
    errno = 0;
    EXPECT_EQ(-1, MAVOACLSetEADirACL((dir_ / "file").c_str()));
    EXPECT_EQ(ENOTDIR, errno);
    errno = 0;
    EXPECT_EQ(-1, MAVOACLSetEADirACL((dir_ / "none").c_str()));
    EXPECT_EQ(ENOENT, errno);
    errno = 0;
    EXPECT_EQ(-1, MAVOACLSetEADirACL(nullptr));
    EXPECT_EQ(EINVAL, errno);
}

TEST_F(EaDirAclTest, AnotherUsersDirectoryIsAFailure) {
    int result = 0;
    int error = 0;
    {
        const AsNobody nobody;
        if (!nobody.ok()) GTEST_SKIP() << "needs the superuser";
        errno = 0;
        result = MAVOACLSetEADirACL(ea_dir_.c_str());
        error = errno;
    }
    EXPECT_EQ(-1, result);
    EXPECT_EQ(EPERM, error);
    EXPECT_EQ("", DefaultAclOf(ea_dir_));
}

TEST_F(EaDirAclTest, NoDescriptorIsLeftOpen) {
    const int before = LowestFreeDescriptor();
    MAVOACLSetEADirACL(ea_dir_.c_str());
    MAVOACLSetEADirACL("/proc");
    MAVOACLSetEADirACL((dir_ / "none").c_str());
    EXPECT_EQ(before, LowestFreeDescriptor());
}

TEST(EaDirAclElsewhereTest, AFilesystemWithoutAclsIsNoFailure) {
    errno = ERANGE;
    EXPECT_EQ(0, MAVOACLSetEADirACL("/proc"));
    EXPECT_EQ(ERANGE, errno);
}

}  // namespace
}  // namespace mavoea::test

// Filesystem types: table first, then the filesystem of what exists.

#include "platform/core/fs_type.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <limits.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "platform/include/mavocore.h"
#include "tests/platform/support/allocation_control.h"
#include "tests/platform/support/private_mounts.h"
#include "tests/support/temp_dir.h"

namespace mavoea::core {
namespace {

using test::PrivateMount;
using test::TempDir;
using test::WriteFile;

TEST(FsTypeOfMagicTest, EveryKnownFilesystemHasItsType) {
    const struct {
        std::uint32_t magic;
        int type;
        const char* name;
    } kKnown[] = {
        {0x00004D44, 0, "FAT"},       {0x2011BAB0, 0, "exFAT"},     {0x5346544E, 0, "NTFS"},
        {0x7366746E, 0, "ntfs3"},     {0x0000517B, 0, "SMB"},       {0xFF534D42, 0, "CIFS"},
        {0xFE534D42, 0, "SMB2"},      {0x00006969, 0, "NFS"},       {0x0000EF53, 1, "ext2/3/4"},
        {0x58465342, 1, "XFS"},       {0x01021994, 1, "tmpfs"},     {0x858458F6, 1, "ramfs"},
        {0x794C7630, 1, "overlayfs"}, {0xF2F52010, 1, "F2FS"},      {0x52654973, 1, "ReiserFS"},
        {0x00003434, 1, "NILFS2"},    {0x7461636F, 1, "OCFS2"},     {0x000072B6, 1, "JFFS2"},
        {0x3153464A, 1, "JFS"},       {0x2FC12FC1, 1, "ZFS"},       {0xCA451A4E, 1, "bcachefs"},
        {0x24051905, 1, "UBIFS"},     {0x01161970, 1, "GFS2"},      {0x9123683E, 2, "btrfs"},
        {0x00004244, 7, "HFS"},       {0x0000482B, 7, "HFS+"},      {0x00009FA0, -1, "proc"},
        {0x62656572, -1, "sysfs"},    {0x00009660, -1, "ISO 9660"}, {0x73717368, -1, "squashfs"},
        {0x00000000, -1, "zero"},     {0xFFFFFFFF, -1, "all ones"},
    };
    for (const auto& known : kKnown) {
        EXPECT_EQ(known.type, FsTypeOfMagic(known.magic, false)) << known.name;
    }
}

TEST(FsTypeOfMagicTest, FuseOnADiskIsNtfsOrExfatAndOtherwiseUnknown) {
    EXPECT_EQ(0, FsTypeOfMagic(0x65735546, true));
    EXPECT_EQ(-1, FsTypeOfMagic(0x65735546, false));
}

class FsTypeTest : public ::testing::Test {
 protected:
    ~FsTypeTest() override { table_.Clear(); }

    int TypeOf(const std::string& path) { return FsTypeOfPath(&table_, path.c_str()); }

    const TempDir dir_;
    const std::string file_ = dir_ / "volumes";
    VolumeTable table_{file_.c_str()};
};

TEST_F(FsTypeTest, OnlyAbsolutePathsHaveAType) {
    for (const char* path : {static_cast<const char*>(nullptr), "", "a", "./a", "../a"}) {
        SCOPED_TRACE(path == nullptr ? "NULL" : path);
        errno = 0;
        EXPECT_EQ(-1, FsTypeOfPath(&table_, path));
        EXPECT_EQ(EINVAL, errno);
        errno = 0;
        EXPECT_EQ(-1, MAVOGetFSType(path, 1));
        EXPECT_EQ(EINVAL, errno);
    }
}

TEST_F(FsTypeTest, MountedFilesystemsHaveTheirType) {
    const struct {
        const char* name;
        int type;
    } kMounts[] = {{"tmpfs", 1}, {"ramfs", 1}, {"sysfs", -1}, {"mqueue", -1}, {"proc", -1}};
    int mounted = 0;
    for (const auto& [name, type] : kMounts) {
        SCOPED_TRACE(name);
        const PrivateMount mount(dir_.path(), name);
        if (!mount.ok()) continue;
        ++mounted;
        errno = ERANGE;
        EXPECT_EQ(type, TypeOf(dir_.path()));
        EXPECT_EQ(type < 0 ? ENOTSUP : ERANGE, errno);
        EXPECT_EQ(type, TypeOf(dir_.path() + "/none/at/all"));
        EXPECT_EQ(type, MAVOGetFSType(dir_.path().c_str(), 0));
        EXPECT_EQ(type, MAVOGetFSType(dir_.path().c_str(), 1));
    }
    if (mounted == 0) GTEST_SKIP() << "needs the superuser, to mount filesystems";
}

TEST_F(FsTypeTest, AnOverlayHasTheTypeOfDisks) {
    for (const char* name : {"lower", "upper", "work", "merged"}) {
        ASSERT_EQ(0, mkdir((dir_ / name).c_str(), 0700));
    }
    const std::string options =
        "lowerdir=" + dir_ / "lower" + ",upperdir=" + dir_ / "upper" + ",workdir=" + dir_ / "work";
    const PrivateMount mount(dir_ / "merged", "overlay", options.c_str());
    if (!mount.ok()) GTEST_SKIP() << "needs the superuser and overlayfs";
    EXPECT_EQ(1, TypeOf(dir_ / "merged"));
}

// Of the filesystems whose mkfs is installed and that the kernel has.
TEST_F(FsTypeTest, DisksHaveTheTypeOfTheirFilesystem) {
    const struct {
        const char* name;
        int type;
    } kDisks[] = {{"ext2", 1}, {"ext4", 1},  {"xfs", 1},   {"btrfs", 2},
                  {"vfat", 0}, {"exfat", 0}, {"ntfs3", 0}, {"hfsplus", 7}};
    int mounted = 0;
    for (const auto& [name, type] : kDisks) {
        SCOPED_TRACE(name);
        const PrivateMount room(dir_.path(), "tmpfs");  // and a mount namespace of its own
        if (!room.ok()) break;
        const std::string disk = dir_ / "disk";
        const std::string place = dir_ / "mounted";
        WriteFile(disk, {});
        ASSERT_EQ(0, truncate(disk.c_str(), 512 << 20));  // holes, as far as mkfs leaves them
        ASSERT_EQ(0, mkdir(place.c_str(), 0700));
        if (MLIBCExec("/bin/sh", "-c",
                      "PATH=/usr/sbin:/sbin:$PATH; exec >/dev/null 2>&1;"
                      "mkfs.${0%3} \"$1\" && mount -t $0 -o loop \"$1\" \"$2\"",
                      name, disk.c_str(), place.c_str(), static_cast<char*>(nullptr)) != 0) {
            continue;
        }
        ++mounted;
        EXPECT_EQ(type, TypeOf(place));
        EXPECT_EQ(type, TypeOf(place + "/none"));
        EXPECT_EQ(0, umount(place.c_str()));
    }
    if (mounted == 0) GTEST_SKIP() << "needs the superuser and loop devices";
}

TEST_F(FsTypeTest, WhatDoesNotExistCountsAsItsNearestExistingParent) {
    ASSERT_EQ(-1, TypeOf("/proc")) << "procfs has no type";
    errno = 0;
    EXPECT_EQ(-1, TypeOf("/proc/none/at/all"));
    EXPECT_EQ(ENOTSUP, errno);
    const int here = TypeOf(dir_.path());
    errno = ERANGE;
    EXPECT_EQ(here, TypeOf(dir_ / "none"));
    EXPECT_EQ(here, TypeOf(dir_ / "none/at/all/"));
    EXPECT_EQ(here, TypeOf(dir_ / "none/../none either"));
    WriteFile(dir_ / "file", {});
    EXPECT_EQ(here, TypeOf(dir_ / "file/in it"));
    EXPECT_EQ(here, TypeOf(dir_ / std::string(300, 'x')));
    EXPECT_EQ(TypeOf("/"), TypeOf("/no such directory"));
    if (here >= 0) {
        EXPECT_EQ(ERANGE, errno) << "what does not exist leaves no trace";
    }
    EXPECT_EQ(-1, TypeOf("/no such directory/../proc/none"));
}

TEST_F(FsTypeTest, PathsThatTheKernelDoesNotTakeCountAsTheirParentsToo) {
    std::string path = "/proc";
    while (path.size() < 3 * PATH_MAX) path += "/" + std::string(100, 'x');
    EXPECT_EQ(-1, TypeOf(path));
    EXPECT_EQ(ENOTSUP, errno);
    for (std::size_t size = PATH_MAX - 3; size <= PATH_MAX + 3; ++size) {
        EXPECT_EQ(TypeOf(dir_.path()), TypeOf((dir_ / std::string(size, 'x')).substr(0, size)));
    }
    ASSERT_TRUE(table_.Declare("/proc/" + std::string(100, 'x'), 3));
    EXPECT_EQ(3, TypeOf(path));
    test::FailNthAllocation fault(1);
    EXPECT_EQ(-1, TypeOf(path)) << "out of memory";
    EXPECT_EQ(ENOMEM, errno);
}

TEST_F(FsTypeTest, SymbolicLinksLeadToTheirFilesystem) {
    ASSERT_EQ(0, symlink("/proc", (dir_ / "link").c_str()));
    EXPECT_EQ(-1, TypeOf(dir_ / "link"));
    EXPECT_EQ(-1, TypeOf(dir_ / "link/self"));
    EXPECT_EQ(-1, TypeOf(dir_ / "link/none"));
    ASSERT_EQ(0, symlink("/nowhere/at/all", (dir_ / "dangling").c_str()));
    EXPECT_EQ(TypeOf(dir_.path()), TypeOf(dir_ / "dangling"));
}

TEST_F(FsTypeTest, ParentsBehindSymbolicLinksAreTheKernelsToFind) {
    ASSERT_EQ(0, symlink("/proc/sys", (dir_ / "link").c_str()));
    EXPECT_EQ(TypeOf("/proc"), TypeOf(dir_ / "link/.."));
    EXPECT_EQ(-1, TypeOf(dir_ / "link/../version"));
}

TEST_F(FsTypeTest, WhatMayNotBeLookedAtIsUnknown) {
    ASSERT_EQ(0, mkdir((dir_ / "private").c_str(), 0700));
    int type = 0;
    int error = 0;
    {
        const test::AsNobody nobody;
        if (!nobody.ok()) GTEST_SKIP() << "needs the superuser";
        errno = 0;
        type = FsTypeOfPath(&table_, (dir_ / "private/a").c_str());
        error = errno;
    }
    EXPECT_EQ(-1, type);
    EXPECT_EQ(EACCES, error);
}

TEST_F(FsTypeTest, TheTableDecidesBeforeTheFilesystem) {
    ASSERT_TRUE(table_.Declare("/proc/self", 7));
    WriteFile(file_, test::Ascii("/proc/sys 2\n"));
    errno = ERANGE;
    EXPECT_EQ(7, TypeOf("/proc/self"));
    EXPECT_EQ(7, TypeOf("//proc/./self/none/"));
    EXPECT_EQ(7, TypeOf("/proc/none/../self"));
    EXPECT_EQ(2, TypeOf("/proc/sys/none"));
    EXPECT_EQ(ERANGE, errno);
    EXPECT_EQ(-1, TypeOf("/proc/selfish"));
    EXPECT_EQ(-1, TypeOf("/proc/self/../none"));
}

TEST_F(FsTypeTest, WhatOtherProgramsKeepIsOfNoKnownType) {
    const std::string volume = dir_ / "volume";
    for (int type :
         {MAVO_VOLUME_SAMBA, MAVO_VOLUME_SAMBA_STREAM, MAVO_VOLUME_NETATALK,
          MAVO_VOLUME_NETATALK_SAMBA, MAVO_VOLUME_LINUX, MAVO_VOLUME_SAMBA_ALL_STREAMS}) {
        EXPECT_EQ(0, MAVOVolumeDeclare(volume.c_str(), type));
        errno = 0;
        EXPECT_EQ(-1, MAVOGetFSType((volume + "/a").c_str(), 1));
        EXPECT_EQ(ENOTSUP, errno);
        MAVOVolumeEntry entry;
        EXPECT_EQ(1, MAVOVolumeFind((volume + "/a").c_str(), &entry));
        EXPECT_EQ(type, entry.type);
    }
}

TEST_F(FsTypeTest, AProcessDeclaresVolumesOfItsOwn) {
    const std::string volume = dir_ / "volume";
    EXPECT_EQ(0, MAVOVolumeDeclare(volume.c_str(), 7));
    EXPECT_EQ(7, MAVOGetFSType((volume + "/a").c_str(), 1));
    EXPECT_EQ(0, MAVOVolumeDeclare((volume + "/").c_str(), 0));
    EXPECT_EQ(0, MAVOGetFSType((volume + "/a").c_str(), 1));

    for (int type : {-1, 13, 99, 106, INT_MIN, INT_MAX}) {
        errno = 0;
        EXPECT_EQ(-1, MAVOVolumeDeclare(volume.c_str(), type));
        EXPECT_EQ(EINVAL, errno);
    }
    for (const char* path : {static_cast<const char*>(nullptr), "", "volume"}) {
        errno = 0;
        EXPECT_EQ(-1, MAVOVolumeDeclare(path, 1));
        EXPECT_EQ(EINVAL, errno);
    }
    {
        test::FailNthAllocation fault(1);
        errno = 0;
        EXPECT_EQ(-1, MAVOVolumeDeclare("/another", 1));
        EXPECT_EQ(ENOMEM, errno);
    }
    EXPECT_EQ(0, MAVOGetFSType(volume.c_str(), 1));
}

}  // namespace
}  // namespace mavoea::core

// The filesystem type of a path: what the volume table says, else what the kernel says.

#include "platform/core/fs_type.h"

#include <errno.h>
#include <limits.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/vfs.h>

#include <cstddef>
#include <string_view>

#include "platform/core/lexical_path.h"
#include "platform/include/mavocore.h"

namespace mavoea::core {
namespace {

// What the types are called here. Others exist, but no filesystem of a host has them.
constexpr int kAppleDouble = 0;
constexpr int kEADir = 1;
constexpr int kFileEA = 2;
constexpr int kXattr = 7;
constexpr int kUnknown = -1;

// Filesystems whose number the kernel keeps to itself or its headers here do not have.
constexpr std::uint32_t kNtfs = 0x5346544E;   // "NTFS", the old driver
constexpr std::uint32_t kNtfs3 = 0x7366746E;  // "ntfs"
constexpr std::uint32_t kHfs = 0x4244;        // "BD"
constexpr std::uint32_t kHfsPlus = 0x482B;    // "H+"
constexpr std::uint32_t kJfs = 0x3153464A;    // "JFS1"
constexpr std::uint32_t kZfs = 0x2FC12FC1;
constexpr std::uint32_t kBcachefs = 0xCA451A4E;
constexpr std::uint32_t kUbifs = 0x24051905;
constexpr std::uint32_t kGfs2 = 0x01161970;

bool MeansNothingThere(int error) {
    return error == ENOENT || error == ENOTDIR || error == ENAMETOOLONG;
}

bool IsOnBlockDevice(const char* path) {
    struct stat status;
    return stat(path, &status) == 0 && major(status.st_dev) != 0;  // 0: no device behind it
}

// The type by the filesystem that an existing path is on. False with errno when statfs() failed.
bool FsTypeOfExisting(const char* path, int* type) {
    struct statfs status;
    int result;
    do {
        result = statfs(path, &status);
    } while (result != 0 && errno == EINTR);
    if (result != 0) return false;
    const auto magic = static_cast<std::uint32_t>(status.f_type);  // 32 bits, signed or not
    *type = FsTypeOfMagic(magic, magic == FUSE_SUPER_MAGIC && IsOnBlockDevice(path));
    return true;
}

}  // namespace

int FsTypeOfMagic(std::uint32_t magic, bool on_block_device) {
    switch (magic) {
        case MSDOS_SUPER_MAGIC:  // FAT of every kind
        case EXFAT_SUPER_MAGIC:
        case kNtfs:
        case kNtfs3:
        case SMB_SUPER_MAGIC:
        case CIFS_SUPER_MAGIC:
        case SMB2_SUPER_MAGIC:
        case NFS_SUPER_MAGIC:
            return kAppleDouble;
        case FUSE_SUPER_MAGIC:
            return on_block_device ? kAppleDouble : kUnknown;
        case EXT4_SUPER_MAGIC:  // ext2 and ext3 too
        case XFS_SUPER_MAGIC:
        case TMPFS_MAGIC:
        case RAMFS_MAGIC:
        case OVERLAYFS_SUPER_MAGIC:
        case F2FS_SUPER_MAGIC:
        case REISERFS_SUPER_MAGIC:
        case NILFS_SUPER_MAGIC:
        case OCFS2_SUPER_MAGIC:
        case JFFS2_SUPER_MAGIC:
        case kJfs:
        case kZfs:
        case kBcachefs:
        case kUbifs:
        case kGfs2:
            return kEADir;
        case BTRFS_SUPER_MAGIC:
            return kFileEA;
        case kHfs:
        case kHfsPlus:
            return kXattr;
        default:
            return kUnknown;
    }
}

int FsTypeOfPath(VolumeTable* table, const char* path) {
    if (path == nullptr || !IsAbsolute(path)) {
        errno = EINVAL;
        return kUnknown;
    }
    const int saved = errno;
    LexicalPath lexical(path);
    if (!lexical.ok()) return kUnknown;

    int type = table->Find(lexical.text());
    if (type >= MAVO_VOLUME_SAMBA) {  // another program's
        errno = ENOTSUP;
        return kUnknown;
    }
    if (type >= 0) return type;

    // As given first: a ".." behind a symbolic link is the kernel's to resolve.
    bool known = FsTypeOfExisting(path, &type);
    while (!known && MeansNothingThere(errno) && !lexical.text().empty()) {
        lexical.CutLast();
        if (lexical.text().size() >= PATH_MAX) continue;  // nothing can be there
        known = FsTypeOfExisting(lexical.c_str(), &type);
    }
    if (!known) return kUnknown;
    errno = type == kUnknown ? ENOTSUP : saved;
    return type;
}

}  // namespace mavoea::core

int MAVOGetFSType(const char* szPath, int /*flag*/) {
    return mavoea::core::FsTypeOfPath(&mavoea::core::ProcessVolumeTable(), szPath);
}

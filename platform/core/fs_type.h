// What decides a path's filesystem type, with a volume table of the caller's choice.
#ifndef MAVOEA_PLATFORM_CORE_FS_TYPE_H_
#define MAVOEA_PLATFORM_CORE_FS_TYPE_H_

#include <cstdint>

#include "platform/core/volume_table.h"

namespace mavoea::core {

// The type of a filesystem that statfs() reports as `magic`; -1 for one that it does not know.
// `on_block_device` tells apart the FUSE filesystems, which share one number: those on a disk are
// NTFS or exFAT (ntfs-3g, exfat-fuse), the others may be anything.
int FsTypeOfMagic(std::uint32_t magic, bool on_block_device);

// MAVOGetFSType() with `table`.
int FsTypeOfPath(VolumeTable* table, const char* path);

}  // namespace mavoea::core

#endif  // MAVOEA_PLATFORM_CORE_FS_TYPE_H_

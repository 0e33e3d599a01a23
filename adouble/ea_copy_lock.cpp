// Carries the Mac locked state of a file from one volume to another, each of its own kind.

#include "adouble/ea_copy_lock.h"

#include <errno.h>
#include <string.h>
#include <unistd.h>

#include "adouble/internal.h"
#include "format/netatalk_record.h"
#include "platform/file_status.h"
#include "platform/marks.h"
#include "util/bytes.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"
#include "util/volume_kind.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_copy_lock");
constexpr char kFunction[] = "MAVOEACopyLock";

constexpr mode_t kPermissions = 07777;
constexpr mode_t kWritable = 0222;

// The AFP attributes that lock a file.
constexpr std::uint16_t kLocking = kAfpNoWrite | kAfpNoRename | kAfpNoDelete;

// What locking sets in the first byte of the attribute word. It is not the byte in which the getter
// looks for kLocking's lower half: a lock set here is seen through the platform's flag only.
constexpr std::uint8_t kLockedByte = 0xA0;

bool Missing(const char* path) { return path == nullptr || *path == '\0'; }

using RecordReader = int (*)(const char* path, EAAdouble* ad);
using RecordFlusher = int (*)(const void* buf, int len, const char* path);

int RecordLockGet(const char* path, RecordReader read) {
    const int flag = EAPlatformLockGet(path);
    return flag != 0 ? flag : EAAdoubleLockGet(path, read);
}

int RecordLockSet(const char* path, int lock, RecordReader read, std::size_t size,
                  RecordFlusher flush) {
    if (EASetLockFlag(path, lock) < 0) return -1;
    EAAdouble record = {};
    const int found = read(path, &record);
    if (found != 0) return found < 0 ? -1 : 0;
    const auto info = EntryBytes(record, Slot::kAfpFileInfo, kAfpFileInfoSize);
    if (!info.empty()) {
        std::uint8_t& byte = info[kAfpAttributesOffset];
        byte = static_cast<std::uint8_t>(lock == 1 ? byte | kLockedByte : byte & ~kLockedByte);
    }
    return flush(record.data, static_cast<int>(size), path);
}

// One source kind of volume: how it is asked, and how each kind of destination is told.
struct LockRow {
    LockGetter getter;
    LockSetter apple_double;
    LockSetter attribute;
    LockSetter ea_dir;
    LockSetter destination_only;
    LockSetter file_ea;
};

// The entries of AppleDouble volumes and of type 7 behave alike and stand apart all the same.
constexpr LockGetter kAppleDoubleGet = EAModeLockGet;
constexpr LockSetter kAppleDoubleSet = EAModeLockSet;
constexpr LockGetter kAttributeGet = EAModeLockGet;
constexpr LockSetter kAttributeSet = EAModeLockSet;

constexpr LockRow kFromAppleDouble = {kAppleDoubleGet,  kAppleDoubleSet, kAttributeSet,
                                      EAEADirFSLockSet, nullptr,         EAFileEAFSLockSet};
constexpr LockRow kFromAttribute = {kAttributeGet,    kAppleDoubleSet, kAttributeSet,
                                    EAEADirFSLockSet, nullptr,         EAFileEAFSLockSet};
constexpr LockRow kFromEADir = {EAEADirFSLockGet, kAppleDoubleSet,  kAttributeSet,
                                EAEADirFSLockSet, EAEADirFSLockSet, EAFileEAFSLockSet};
constexpr LockRow kFromFileEA = {EAFileEAFSLockGet, kAppleDoubleSet,  kAttributeSet,
                                 EAEADirFSLockSet,  EAEADirFSLockSet, EAFileEAFSLockSet};

const LockRow* RowFor(int srcFSType) {
    switch (VolumeKindOf(srcFSType)) {
        case VolumeKind::kAppleDouble:
            return &kFromAppleDouble;
        case VolumeKind::kAttribute:
            return &kFromAttribute;
        case VolumeKind::kEADir:
            return &kFromEADir;
        case VolumeKind::kFileEA:
            return &kFromFileEA;
        case VolumeKind::kDestinationOnly:
        case VolumeKind::kNone:
            return nullptr;
    }
    return nullptr;
}

// The type of the volume that holds szDst's parent, which is there when szDst need not be.
int DestinationType(const char* szDst) {
    char parent[4095];
    CutShort(parent, sizeof parent).Add(szDst);
    char* const slash = strrchr(parent, '/');
    if (slash == nullptr) {
        unit.Log("%s:%d(%s) Failed to strrchr '/' of %s, reason=%s.\n", kFunction, szDst,
                 strerror(errno));
        return -1;
    }
    *slash = '\0';
    const int type = MAVOGetFSType(parent, 1);
    if (type < 0) unit.Log("%s:%d(%s) Failed to get fs type of %s.\n", kFunction, szDst);
    return type;
}

}  // namespace

int EAModeLockGet(const char* path) {
    if (Missing(path)) return unit.Fail(Err::kBadArgument);
    struct stat info;
    if (kernel::Stat(path, &info) != 0) return -1;
    return (info.st_mode & kWritable) == 0 ? 1 : 0;
}

int EAModeLockSet(const char* path, int lock) {
    if (Missing(path)) return unit.Fail(Err::kBadArgument);
    struct stat info;
    if (kernel::Stat(path, &info) != 0) return -1;
    const mode_t mode = info.st_mode & kPermissions;
    const mode_t wanted = lock == 1 ? mode & ~kWritable : mode | kWritable;
    return kernel::Chmod(path, wanted) != 0 ? unit.Fail(Err::kSystemCall) : 0;
}

int EAPlatformLockGet(const char* path) {
    if (Missing(path)) return unit.Fail(Err::kBadArgument);
    FileStatus status;
    if (!ReadFileStatus(path, &status)) return -1;
    return (status.attributes & MLIBC_ATTRIBUTE_LOCKED) != 0 ? 1 : 0;
}

int EASetLockFlag(const char* path, int lock) {
    if (Missing(path)) return unit.Fail(Err::kBadArgument);
    (void)kernel::FileCommand(path, lock == 1 ? marks::kSetLocked : marks::kClearLocked);
    return 0;
}

int EAAdoubleLockGet(const char* path, RecordReader read) {
    if (Missing(path) || read == nullptr) return unit.Fail(Err::kBadArgument);
    EAAdouble record = {};
    const int found = read(path, &record);
    if (found != 0) return found < 0 ? -1 : 0;
    const auto info = EntryBytes(record, Slot::kAfpFileInfo, kAfpFileInfoSize);
    if (info.empty()) return 0;
    BeReader in(info.subspan(kAfpAttributesOffset));
    return (in.U16() & kLocking) != 0 ? 1 : 0;
}

int EAEADirFSLockGet(const char* path) { return RecordLockGet(path, MAVOEAEADirAdoubleRead); }
int EAFileEAFSLockGet(const char* path) { return RecordLockGet(path, MAVOEAFileEAAdoubleRead); }

int EAEADirFSLockSet(const char* path, int lock) {
    if (Missing(path)) return unit.Fail(Err::kBadArgument);
    return RecordLockSet(path, lock, MAVOEAEADirAdoubleRead, kResourceHeadSize,
                         MAVOEAEADirAdoubleFlush);
}

int EAFileEAFSLockSet(const char* path, int lock) {
    if (Missing(path)) return unit.Fail(Err::kBadArgument);
    return RecordLockSet(path, lock, MAVOEAFileEAAdoubleRead, kAttributeBlockSize,
                         MAVOEAFileEAAdoubleFlush);
}

int EACopyLockState(const char* szSrc, const char* szDst, LockGetter getter, LockSetter setter) {
    if (Missing(szSrc) || Missing(szDst)) return unit.Fail(Err::kBadArgument);
    if (getter == nullptr || setter == nullptr) return unit.Fail(Err::kBadArgument);
    const int locked = getter(szSrc);
    if (locked < 0) return -1;
    return setter(szDst, locked == 1 ? 1 : 0) < 0 ? -1 : 0;
}

LockGetter LockGetterFor(int srcFSType) {
    const LockRow* const row = RowFor(srcFSType);
    return row == nullptr ? nullptr : row->getter;
}

LockSetter LockSetterFor(int srcFSType, int dstFSType) {
    const LockRow* const row = RowFor(srcFSType);
    if (row == nullptr) return nullptr;
    switch (VolumeKindOf(dstFSType)) {
        case VolumeKind::kAppleDouble:
            return row->apple_double;
        case VolumeKind::kAttribute:
            return row->attribute;
        case VolumeKind::kEADir:
            return row->ea_dir;
        case VolumeKind::kDestinationOnly:
            return row->destination_only;
        case VolumeKind::kFileEA:
            return row->file_ea;
        case VolumeKind::kNone:
            return nullptr;
    }
    return nullptr;
}

int MAVOEACopyLock(const char* szSrc, const char* szDst, int srcFSType, int dstFSType) {
    if (Missing(szSrc) || Missing(szDst)) return unit.Fail(Err::kBadArgument);
    if (kernel::Access(szSrc, F_OK) != 0) return 0;
    if (srcFSType == -1) {
        srcFSType = MAVOGetFSType(szSrc, 1);
        if (srcFSType < 0) {
            unit.Log("%s:%d(%s) Failed to get fs type of %s.\n", kFunction, szSrc);
            return -1;
        }
    }
    if (dstFSType == -1) {
        dstFSType = DestinationType(szDst);
        if (dstFSType < 0) return -1;
    }
    const LockGetter getter = LockGetterFor(srcFSType);
    if (getter == nullptr) return -2;
    const LockSetter setter = LockSetterFor(srcFSType, dstFSType);
    if (setter == nullptr) return 0;

    const int result = EACopyLockState(szSrc, szDst, getter, setter);
    if (result == -2 || result >= 0) return 0;
    unit.Log("%s:%d [0x%04X %s:%d]EACopy lock fail: from [%s] to [%s] %m", MLIBCErrGet(),
             MLIBCErrorGetFile(), MLIBCErrorGetLine(), szSrc, szDst);
    return result;
}

}  // namespace mavoea

// Carries an object's metadata to where its data has been copied or moved, between volumes of any
// two kinds.

#include "ops/ea_copy.h"

#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include "adouble/ea_copy_lock.h"
#include "adouble/internal.h"
#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "util/owned.h"
#include "util/volume_kind.h"

namespace mavoea {
namespace {

constexpr Unit unit = copy_unit;
constexpr char kFunction[] = "MAVOEACopyEx";

// ---- What cells are made of ---------------------------------------------------------------------

int FromAppleDouble(const CopyRequest& copy) {
    return EACopyFromADFS(copy.src, copy.dst, copy.move, copy.dst_type);
}
int AttributesToAppleDouble(const CopyRequest& copy) {
    return EACopyXattrToEAStream(copy.src, copy.dst, EA_PLACE_APPLEDOUBLE);
}
int AttributesToAttributes(const CopyRequest& copy) {
    if (CopyXattrs(copy.src, copy.dst) != 0) return -1;
    kernel::Sync();
    return 0;
}
int AttributesToEADir(const CopyRequest& copy) {
    return EACopyXattrToEADirFS(copy.src, copy.dst, copy.move);
}
int EADirToAppleDouble(const CopyRequest& copy) {
    return EACopyToADFS(copy.src, copy.dst, copy.move);
}
int EADirToAttributes(const CopyRequest& copy) {
    return EACopyToXattrFS(copy.src, copy.dst, copy.move);
}
int EADirToEADir(const CopyRequest& copy) {
    return EACopyEADirFSToEADirFS(copy.src, copy.dst, copy.move, copy.copy_fn);
}
int EADirToEADirByCommand(const CopyRequest& copy) {
    return EACopyEADirFSToEADirFS(copy.src, copy.dst, copy.move, nullptr);
}
int EADirToFileEA(const CopyRequest& copy) {
    return EACopyEADirFSToFileEAFS(copy.src, copy.dst, copy.move, copy.copy_fn);
}
int FileEAToAppleDouble(const CopyRequest& copy) {
    return EACopyFileEAFSToADFS(copy.src, copy.dst, copy.move);
}

// Unlike every other step, what removes the resource file beside a source with real attributes
// takes a move for one only when it is exactly 1.
int RemoveResource(const CopyRequest& copy) {
    return copy.move == 1 ? EARemoveSrcResource(copy.src) : 0;
}
int RemoveRecord(const CopyRequest& copy) { return copy.move != 0 ? RemoveSrcRecord(copy.src) : 0; }
int SyncResourceFile(const CopyRequest& copy) { return EAFileEAFSFinfoFileSync(copy.src); }
int SyncAttribute(const CopyRequest& copy) { return MAVOEAFileEAFSFinfoEASync(copy.dst, 0); }
int StampFlushTime(const CopyRequest& copy) { return MAVOEAFileEAWriteFlushTime(copy.dst, 0); }

// Legacy layouts become current ones as far as that goes.
int UpgradeSource(const CopyRequest& copy) {
    if (MAVOEAUpgrade(copy.src, MAVOEA_KIND_RESOURCE) < 0) {
        unit.Log("%s:%d Fail to upgrde MavoResource of %s.[0x%04X %s:%d]", copy.src,  // sic
                 MLIBCErrGet(), MLIBCErrorGetFile(), MLIBCErrorGetLine());
    }
    if (MAVOEAUpgrade(copy.src, MAVOEA_KIND_STREAM) < 0) {
        unit.Log("%s:%d Fail to upgrde eastream of %s.[0x%04X %s:%d]", copy.src,  // sic
                 MLIBCErrGet(), MLIBCErrorGetFile(), MLIBCErrorGetLine());
    }
    return 0;
}

int Unsupported(const CopyRequest& /*copy*/) { return kCopyUnsupported; }

// ---- Steps --------------------------------------------------------------------------------------

using Complaint = LogFormat<int, const char*, int, const char*, const char*>;

enum class OnFailure {
    kReturn,  // the step's own result is the copy's
    kFail,    // -1 is
    kGoOn,
};

struct Step {
    int (*run)(const CopyRequest& copy) = nullptr;
    OnFailure on_failure = OnFailure::kReturn;
    Complaint complaint = "%s:%d [0x%04X %s:%d]%s%s";  // not of steps whose result is the copy's
};

constexpr Step Result(int (*run)(const CopyRequest&)) { return {.run = run}; }
constexpr Step Fatal(int (*run)(const CopyRequest&), Complaint complaint) {
    return {run, OnFailure::kFail, complaint};
}
constexpr Step Logged(int (*run)(const CopyRequest&), Complaint complaint) {
    return {run, OnFailure::kGoOn, complaint};
}

constexpr Complaint kCp = "%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m";
constexpr Complaint kRemove = "%s:%d [0x%04X %s:%d]Failed to remove [%s]->[%s]. %m";
constexpr Complaint kEASync = "%s:%d [0x%04X %s:%d]Failed ea sync [%s]->[%s]. %m";
constexpr Complaint kWriteTime = "%s:%d [0x%04X %s:%d]Failed ea write time [%s]->[%s]. %m";
constexpr Complaint kFileSync = "%s:%d [0x%04X %s:%d]Failed file sync [%s]->[%s]. %m";

// ---- The table ----------------------------------------------------------------------------------

// The steps from one kind of volume to another, in order.
struct Cell {
    Step steps[3];
};

struct Row {
    Cell apple_double;
    Cell attribute;
    Cell ea_dir;
    Cell destination_only;
    Cell file_ea;
    Cell none;
};

constexpr Cell kUnsupported = {{Result(Unsupported)}};

constexpr Cell kFromAppleDouble = {{Result(FromAppleDouble)}};
constexpr Row kAppleDoubleRow = {
    .apple_double = kFromAppleDouble,
    .attribute = kFromAppleDouble,
    .ea_dir = kFromAppleDouble,
    .destination_only = kFromAppleDouble,
    .file_ea = kFromAppleDouble,
    .none = kFromAppleDouble,
};

constexpr Row kAttributeRow = {
    .apple_double = {{Fatal(AttributesToAppleDouble, kCp), Fatal(RemoveResource, kRemove)}},
    .attribute = {{Fatal(AttributesToAttributes, kCp), Fatal(RemoveResource, kRemove)}},
    .ea_dir = {{Result(AttributesToEADir)}},
    .destination_only = kUnsupported,
    .file_ea = {{Fatal(AttributesToEADir, kCp), Fatal(SyncAttribute, kEASync),
                 Fatal(StampFlushTime, kWriteTime)}},
    .none = kUnsupported,
};

constexpr Row kEADirRow = {
    .apple_double = {{Result(UpgradeSource), Result(EADirToAppleDouble)}},
    .attribute = {{Result(UpgradeSource), Result(EADirToAttributes)}},
    .ea_dir = {{Result(UpgradeSource), Result(EADirToEADir)}},
    .destination_only = {{Result(UpgradeSource), Result(EADirToEADir)}},
    .file_ea = {{Result(UpgradeSource), Result(EADirToFileEA)}},
    .none = {{Result(UpgradeSource), Result(Unsupported)}},
};

constexpr Cell kFileEAToEADir = {
    {Fatal(SyncResourceFile, kFileSync), Fatal(EADirToEADir, kCp), Result(RemoveRecord)}};
constexpr Row kFileEARow = {
    .apple_double = {{Result(FileEAToAppleDouble)}},
    .attribute = {{Fatal(SyncResourceFile, kFileSync), Fatal(EADirToAttributes, kCp),
                   Result(RemoveRecord)}},
    .ea_dir = kFileEAToEADir,
    .destination_only = kFileEAToEADir,
    .file_ea = {{Fatal(EADirToEADirByCommand, kCp), Logged(SyncAttribute, kEASync),
                 Logged(StampFlushTime, kWriteTime)}},
    .none = kUnsupported,
};

// nullptr for a source that keeps no metadata.
const Row* RowFrom(VolumeKind source) {
    switch (source) {
        case VolumeKind::kAppleDouble:
            return &kAppleDoubleRow;
        case VolumeKind::kAttribute:
            return &kAttributeRow;
        case VolumeKind::kEADir:
            return &kEADirRow;
        case VolumeKind::kFileEA:
            return &kFileEARow;
        case VolumeKind::kDestinationOnly:
        case VolumeKind::kNone:
            return nullptr;
    }
    return nullptr;
}

const Cell& CellTo(const Row& row, VolumeKind destination) {
    switch (destination) {
        case VolumeKind::kAppleDouble:
            return row.apple_double;
        case VolumeKind::kAttribute:
            return row.attribute;
        case VolumeKind::kEADir:
            return row.ea_dir;
        case VolumeKind::kDestinationOnly:
            return row.destination_only;
        case VolumeKind::kFileEA:
            return row.file_ea;
        case VolumeKind::kNone:
            return row.none;
    }
    return row.none;
}

int Run(const Cell& cell, const CopyRequest& copy) {
    int result = 0;
    for (const Step& step : cell.steps) {
        if (step.run == nullptr) break;
        result = step.run(copy);
        if (result >= 0) continue;
        if (step.on_failure == OnFailure::kReturn) break;
        unit.LogWrapped(step.complaint, copy.src, static_cast<const char*>(copy.dst));
        if (step.on_failure == OnFailure::kFail) return -1;
        result = 0;
    }
    return result;
}

// ---- The driver ---------------------------------------------------------------------------------

// The type of the volume of dst's parent directory; dst itself need not be there.
int DestinationType(char* dst) {
    char* const slash = strrchr(dst, '/');
    if (slash == nullptr) {
        unit.Log("%s:%d(%s) Failed to strrchr '/' of %s, reason=%s.\n", kFunction, dst,
                 strerror(errno));
        return -1;
    }
    *slash = '\0';
    const int type = MAVOGetFSType(dst, 1);
    *slash = '/';
    if (type < 0) unit.Log("%s:%d(%s) Failed to get fs type of %s.\n", kFunction, dst);
    return type;
}

bool ResolveTypes(CopyRequest* copy) {
    if (copy->src_type == -1) copy->src_type = MAVOGetFSType(copy->src, 1);
    if (copy->src_type < 0) {
        unit.Log("%s:%d(%s) Failed to get fs type of %s.\n", kFunction, copy->src);
        return false;
    }
    if (copy->dst_type == -1) {
        copy->dst_type = DestinationType(copy->dst);
        return copy->dst_type >= 0;
    }
    if (copy->dst_type < 0) {
        unit.Log("%s:%d(%s) Failed to get fs type of %s.\n", kFunction, copy->dst);
        return false;
    }
    return true;
}

int Carry(CopyRequest copy) {
    if (copy.src == nullptr || copy.dst == nullptr) return unit.Fail(Err::kBadArgument);
    if (!ResolveTypes(&copy)) return -1;
    const Row* const row = RowFrom(VolumeKindOf(copy.src_type));
    if (row == nullptr) return kCopyUnsupported;

    const int result = Run(CellTo(*row, VolumeKindOf(copy.dst_type)), copy);
    const bool nothing_to_carry = result == kCopyUnsupported || result == MAVOEA_ERR_NAME_TOO_LONG;
    if (result < 0 && !nothing_to_carry) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]EACopy fail: from [%s] to [%s] %m", copy.src,
                        static_cast<const char*>(copy.dst));
        return result;
    }
    const bool locked = MAVOEACopyLock(copy.src, copy.dst, copy.src_type, copy.dst_type) >= 0;
    if (nothing_to_carry) return locked ? 0 : result;
    if (locked) FinishCopy(copy);
    return result;
}

// Operations of the two indexes.
enum IndexOperation {
    kFileIndexAdded = 1,
    kIndexFile = 1,
    kIndexDirectory = 3,
    kFileIndexMoved = 3,
    kIndexRenamed = 4,
    kFileIndexRemoved = 6,
};

void Notify(const CopyRequest& copy) {
    if (copy.move != 0) {
        if (copy.update_index != 0) (void)MAVOIndex(copy.dst, copy.src, kIndexRenamed);
        if (copy.update_file_index != 0) {
            (void)MLIBMavoFileIndexAdd(copy.src, nullptr, kFileIndexRemoved);
            (void)MLIBMavoFileIndexAdd(copy.dst, nullptr, kFileIndexMoved);
        }
        return;
    }
    if (copy.update_index != 0) {
        struct stat info;
        const bool directory =
            copy.dst != nullptr && kernel::Stat(copy.dst, &info) == 0 && S_ISDIR(info.st_mode);
        (void)MAVOIndex(copy.dst, nullptr, directory ? kIndexDirectory : kIndexFile);
    }
    if (copy.update_file_index != 0) {
        (void)MLIBMavoFileIndexAdd(copy.dst, nullptr, kFileIndexAdded);
    }
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEACopyEx(const char* szSrc, char* szDst, int move, int copyEADir, int srcFSType,
                 int dstFSType, int updateFileIndex, int updateIndex,
                 int (*copyFn)(const char* from, const char* to)) {
    const CopyRequest copy = {.src = szSrc,
                              .dst = szDst,
                              .move = move,
                              .copy_eadir = copyEADir,
                              .src_type = srcFSType,
                              .dst_type = dstFSType,
                              .update_file_index = updateFileIndex,
                              .update_index = updateIndex,
                              .copy_fn = copyFn};
    const int result = Carry(copy);
    Notify(copy);
    return result;
}

int MAVOEACopy(const char* szSrc, char* szDst, int move, int copyEADir, int srcFSType,
               int dstFSType, int updateFileIndex, int updateIndex) {
    return MAVOEACopyEx(szSrc, szDst, move, copyEADir, srcFSType, dstFSType, updateFileIndex,
                        updateIndex, nullptr);
}

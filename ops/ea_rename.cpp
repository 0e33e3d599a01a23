// Moves the metadata of an object that has been renamed.

#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"
#include "util/volume_kind.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_rename.c");

// The operation of both indexes.
constexpr int kRenamed = 4;

// Makes the directory in which `path` is to lie.
int MakeParent(const char* path) {
    char dir[kPathBufferSize];
    CutShort(dir, sizeof dir).Add(path);
    char* const slash = strrchr(dir, '/');
    if (slash == nullptr) return -1;
    *slash = '\0';
    return MAVOEAMKDir(0, dir);
}

// Whether both lie in the same directory, as far as their text tells.
bool SameParent(const char* source, const char* target) {
    return SplitObject(source).parent == SplitObject(target).parent;
}

// The rename of source to target has failed, with errno.
int MoveOtherwise(const char* source, const char* target) {
    if (errno != ENOENT) {
        if (errno != EXDEV) return unit.Fail(Err::kRename);
        // The program would move into a directory, or through a link to one.
        if (!IsMetadataOrMissing(target)) return unit.Fail(Err::kRename);
        const int status = MLIBCExec("/bin/mv", source, target, nullptr);
        if (status != 0) {
            unit.Fail(Err::kRename);  // first that it could not be moved, then that it was not
            unit.Fail(Err::kRename);
            return status;
        }
    }
    (void)EARemoveEADir(source);
    return 0;
}

int Move(const char* source, const char* target) {
    if (kernel::Rename(source, target) != 0) return MoveOtherwise(source, target);
    // What has just been put into a directory keeps it from being empty.
    if (!SameParent(source, target)) (void)EARemoveEADir(source);
    return 0;
}

// Whether it may not be looked at. The upgrade asks as the real user, all else is done as the
// effective one.
bool IsHidden(const char* path) {
    const ErrnoKeeper keep;
    struct stat info;
    return kernel::Stat(path, &info) != 0 && errno == EACCES;
}

// A file that the upgrade has just seen, within its directory. For who may not look there is
// nothing to move.
int MoveWithin(const char* source, const char* target) {
    if (kernel::Rename(source, target) == 0) return 0;
    return errno == EACCES && IsHidden(source) ? 0 : MoveOtherwise(source, target);
}

// One item of the EA directory: the file of kind szName, or the whole legacy folder in its form.
// 0, -1, or the exit status of /bin/mv.
int EARenameEA(int form, const char* szOldPath, const char* szNewPath, const char* szName) {
    char source[kPathBufferSize];
    char target[kPathBufferSize];
    if (form == EA_FORM_FILE && szName != nullptr) {
        const int upgraded = MAVOEAUpgrade(szOldPath, szName);
        if (upgraded == 2) return 0;
        if (upgraded == -1) return -1;
        if (MAVOEAPath(EA_FORM_FILE, szOldPath, szName, source, kDerivedPathMax, EA_PLACE_EADIR) !=
                0 ||
            MAVOEAPath(EA_FORM_FILE, szNewPath, szName, target, kDerivedPathMax, EA_PLACE_EADIR) !=
                0) {
            return -1;
        }
    } else if (form == EA_FORM_FOLDER) {
        if (MAVOEADirPath(EA_FORM_FOLDER, szOldPath, source, kDerivedPathMax) != 0 ||
            MAVOEADirPath(EA_FORM_FOLDER, szNewPath, target, kDerivedPathMax) != 0) {
            return -1;
        }
    } else {
        return unit.Fail(Err::kBadArgument);
    }

    const bool within = SameParent(source, target);
    if (form == EA_FORM_FILE && within) return MoveWithin(source, target);
    struct stat from;
    if (kernel::Stat(source, &from) != 0) return 0;
    struct stat to;
    if (form == EA_FORM_FILE || kernel::Stat(target, &to) != 0) {
        // The source's directory is there.
        if (!within && MakeParent(target) != 0) return -1;
    } else if (!SameFile(from, to)) {
        if (EARemove(EA_FORM_FOLDER, szNewPath) != 0) return -1;
    }
    return Move(source, target);
}

void ReportRename(const char* szOldPath, const char* szNewPath, const EAIndexFlags* flags) {
    if (flags == nullptr || flags->index == 1) (void)MAVOIndex(szNewPath, szOldPath, kRenamed);
    if (flags == nullptr || flags->fileIndex == 1) {
        (void)MLIBMavoFileIndexAdd(szNewPath, szOldPath, kRenamed);
    }
}

// The "._" file, and the legacy folder with it; as far as that goes.
void MoveAppleDouble(const char* szOldPath, const char* szNewPath) {
    char source[kPathBufferSize];
    char target[kPathBufferSize];
    struct stat from;
    if (MAVOEAADPath(szOldPath, source, kDerivedPathMax) != 0) return;
    if (kernel::Stat(source, &from) != 0) return;
    if (MAVOEAADPath(szNewPath, target, kDerivedPathMax) != 0) return;
    struct stat to;
    if (kernel::Stat(target, &to) == 0 && !SameFile(from, to) && kernel::Remove(target) != 0) {
        return;
    }
    if (kernel::Rename(source, target) == 0) {
        (void)EARenameEA(EA_FORM_FOLDER, szOldPath, szNewPath, nullptr);
    }
}

int EARenameAD(const char* szOldPath, const char* szNewPath, const EAIndexFlags* flags) {
    if (szOldPath == nullptr || szNewPath == nullptr) return -1;
    MoveAppleDouble(szOldPath, szNewPath);
    ReportRename(szOldPath, szNewPath, flags);
    return 0;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEARename(const char* szOldPath, const char* szNewPath, int fsType, EAIndexFlags* pFlags) {
    if (szOldPath == nullptr || szNewPath == nullptr) return unit.Fail(Err::kBadArgument);
    if (fsType == -1) {
        fsType = MAVOGetFSType(szNewPath, 1);
        if (fsType == -1) {
            unit.Log("%s:%d Fail to detect FileSystem type. Need ABSOLUTE PATH.");
            return -1;
        }
    }
    switch (VolumeKindOf(fsType)) {
        case VolumeKind::kAppleDouble:
            return EARenameAD(szOldPath, szNewPath, pFlags);
        case VolumeKind::kEADir:
        case VolumeKind::kFileEA:
        case VolumeKind::kAttribute:
            break;
        case VolumeKind::kDestinationOnly:
        case VolumeKind::kNone:
            return 0;
    }
    // Each is tried whatever became of the others.
    const int resource = EARenameEA(EA_FORM_FILE, szOldPath, szNewPath, MAVOEA_KIND_RESOURCE);
    const int stream = EARenameEA(EA_FORM_FILE, szOldPath, szNewPath, MAVOEA_KIND_STREAM);
    const int folder = EARenameEA(EA_FORM_FOLDER, szOldPath, szNewPath, nullptr);
    ReportRename(szOldPath, szNewPath, pFlags);
    (void)EASetSmbArchive(szNewPath);
    return resource + stream + folder;
}

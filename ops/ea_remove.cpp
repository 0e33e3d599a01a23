// Removes the metadata of an object that is removed.

#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include <string_view>

#include "include/mavoea.h"
#include "ops/folder.h"
#include "platform/include/mavocore.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"
#include "util/volume_kind.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_remove");

// Operations of the two indexes.
constexpr int kIndexRemoved = 7;
constexpr int kFileIndexRemoved = 6;

// Set while MAVOEARemoveWithoutEAStream() runs: EARemove() then leaves the stream.
int keep_stream = 0;

constexpr std::string_view kEADirName = "@eaDir";
constexpr const char* kCover = ".cover";

bool Exists(const char* path) { return kernel::Access(path, F_OK) == 0; }

// The type of the volume that holds szPath's parent; -1 after saying why it cannot be told.
int FindType(const char* szPath) {
    char dir[MAVOEA_PATH_SIZE];
    CutShort(dir, sizeof dir).Add(szPath);
    if (char* const slash = strrchr(dir, '/'); slash != nullptr) {
        *slash = '\0';
    } else if (!Exists(szPath) && kernel::Getcwd(dir, sizeof dir) == nullptr) {
        unit.Log("%s:%d Fail to getcwd. %m");
        return -1;
    }
    const int type = MAVOGetFSType(dir, 1);
    return type == -1 ? unit.Fail(Err::kSystemCall) : type;
}

// ---- The two forms of the EA directory ----------------------------------------------------------

// Removes a legacy folder and what is in it. *last becomes the path of what was removed last, if
// anything was.
int RemoveFolder(const char* path, char* last, std::size_t last_size) {
    // Of a symbolic link in a folder's place only the link is this object's.
    struct stat info;
    if (kernel::Lstat(path, &info) == 0 && S_ISLNK(info.st_mode)) {
        return kernel::Remove(path) == 0 ? 0 : unit.Fail(Err::kRemove);
    }
    Folder folder(path);
    if (!folder) {
        unit.Fail(Err::kOpen);
        return 0;  // What cannot be read is left to whoever can.
    }
    while (const char* const name = folder.Next()) {
        CutShort(last, static_cast<int>(last_size)).Add(path).Add("/").Add(name);
        if (kernel::Unlink(last) != 0) {
            unit.Log("%s:%d Fail to remove %s. %m", last);
            return -1;
        }
    }
    return kernel::Remove(path) == 0 ? 0 : unit.Fail(Err::kRemove);
}

// Removes the metadata file of that kind; its path is then in `file`. Missing is as good.
bool RemoveFile(const char* szPath, const char* kind, char* file) {
    if (MAVOEAPath(EA_FORM_FILE, szPath, kind, file, kDerivedPathMax, EA_PLACE_EADIR) != 0) {
        return false;
    }
    return kernel::Unlink(file) == 0 || errno == ENOENT || errno == ENOTDIR;
}

int RemoveFiles(const char* szPath, char* last) {
    const bool resource = RemoveFile(szPath, MAVOEA_KIND_RESOURCE, last);
    if (keep_stream == 0 && !RemoveFile(szPath, MAVOEA_KIND_STREAM, last)) {
        return unit.Fail(Err::kRemove);
    }
    return resource ? 0 : unit.Fail(Err::kRemove);
}

// ---- The kinds of volumes -----------------------------------------------------------------------

int RemoveFromAppleDouble(const char* szPath) {
    char file[kPathBufferSize];
    if (MAVOEAADPath(szPath, file, kDerivedPathMax) != 0) {
        // Names that are too long for a "._" file have none.
        return MLIBCErrGet() == MAVOEA_ERR_NAME_TOO_LONG ? 0 : -1;
    }
    if (kernel::Unlink(file) != 0 && errno != ENOENT) return unit.Fail(Err::kRemove);
    (void)EARemove(EA_FORM_FOLDER, szPath);
    return 0;
}

int RemoveFromEADir(const char* szPath) {
    const int folder = EARemove(EA_FORM_FOLDER, szPath);
    const int files = EARemove(EA_FORM_FILE, szPath);
    return folder == 0 && files == 0 ? 0 : -1;
}

void ReportRemoval(const char* szPath, const EAIndexFlags* flags) {
    if (flags == nullptr || flags->index == 1) (void)MAVOIndex(szPath, nullptr, kIndexRemoved);
    if (flags == nullptr || flags->fileIndex == 1) {
        (void)MLIBMavoFileIndexAdd(szPath, nullptr, kFileIndexRemoved);
    }
}

// ---- EA directories -----------------------------------------------------------------------------

// Whether nothing is in `dir` but its cover.
bool OnlyCover(Folder& dir, const char* cover) {
    while (const char* const name = dir.Next()) {
        struct stat info;
        if (strcmp(name, kCover) != 0 || kernel::Stat(cover, &info) != 0 ||
            !S_ISREG(info.st_mode)) {
            return false;
        }
    }
    return !dir.failed();
}

int RemoveCovered(const char* dir_path, const char* cover) {
    Folder dir(dir_path);
    if (!dir) {
        if (errno == ENOENT) return 0;
        unit.Log("%s:%d Failed to opendir %s, reason=%m.\n", dir_path);
        return -1;
    }
    if (!OnlyCover(dir, cover)) return -1;
    (void)kernel::Unlink(cover);
    dir.Close();
    return kernel::Remove(dir_path) == 0 ? 0 : -1;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int EARemoveEADir(const char* szMetaPath) {
    if (szMetaPath == nullptr) return -1;
    char dir[kPathBufferSize];
    CutShort(dir, sizeof dir).Add(szMetaPath);
    char* const name = strstr(dir, kEADirName.data());
    if (name == nullptr) return -1;
    name[kEADirName.size()] = '\0';

    // The kernel knows whether a directory is empty, however large it was.
    if (kernel::Rmdir(dir) == 0) return 0;
    if (errno == ENOENT) return 0;
    const bool others = errno == ENOTEMPTY;
    char cover[kPathBufferSize + 8];
    CutShort(cover, sizeof cover).Add(dir).Add("/").Add(kCover);
    if (others && kernel::Access(cover, F_OK) != 0 && errno == ENOENT) return -1;
    return RemoveCovered(dir, cover);
}

int EARemove(int form, const char* szPath) {
    char dir[kPathBufferSize];
    if (MAVOEADirPath(form, szPath, dir, kDerivedPathMax) != 0) return -1;
    if (!Exists(dir)) return 0;

    char last[kPathBufferSize + 256] = "";
    int result = 0;
    if (form == EA_FORM_FOLDER) {
        result = RemoveFolder(dir, last, sizeof last);
    } else if (form == EA_FORM_FILE) {
        result = RemoveFiles(szPath, last);
    }
    if (result != 0) return -1;
    if (*last != '\0') (void)EARemoveEADir(last);
    return 0;
}

int MAVOEARemove(const char* szPath, int fsType, EAIndexFlags* pFlags) {
    if (szPath == nullptr) return unit.Fail(Err::kBadArgument);
    if (fsType == -1) {
        fsType = FindType(szPath);
        if (fsType == -1) return -1;
    }
    const VolumeKind kind = VolumeKindOf(fsType);
    int result = 0;
    switch (kind) {
        case VolumeKind::kAppleDouble:
            result = RemoveFromAppleDouble(szPath);
            break;
        case VolumeKind::kAttribute:
            break;
        case VolumeKind::kEADir:
        case VolumeKind::kFileEA:
            result = RemoveFromEADir(szPath);
            break;
        case VolumeKind::kDestinationOnly:
        case VolumeKind::kNone:
            return 0;
    }
    ReportRemoval(szPath, pFlags);
    if (kind == VolumeKind::kEADir || kind == VolumeKind::kFileEA) (void)EASetSmbArchive(szPath);
    return result;
}

int MAVOEARemoveWithoutEAStream(const char* szPath, int fsType) {
    keep_stream = 1;
    const int result = MAVOEARemove(szPath, fsType, nullptr);
    keep_stream = 0;
    return result;
}

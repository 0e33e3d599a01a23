// What follows a copy of metadata: the source of a move is cleaned, and the other files that its EA
// directory holds for the object are carried over.

#include <dirent.h>
#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include "include/mavoea.h"
#include "ops/ea_copy.h"
#include "ops/folder.h"
#include "platform/include/mavocore.h"
#include "util/metadata_file.h"
#include "util/path_text.h"
#include "util/volume_kind.h"

namespace mavoea {
namespace {

constexpr Unit unit = copy_unit;

constexpr mode_t kMode = 0777;

// The operation of both indexes when the other files are lost.
constexpr int kIndexLost = 2;

using Path = char[kPathBufferSize];

void Join(Path path, const char* dir, const char* name) {
    CutShort(path, MAVOEA_PATH_SIZE).Add(dir).Add("/").Add(name);
}

// Some file systems do not say what an entry is.
bool IsRegular(const dirent& entry, const char* path) {
    if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_REG;
    struct stat info;
    return kernel::Lstat(path, &info) == 0 && S_ISREG(info.st_mode);
}

void LogNotCopied(const char* from, const char* to, int line = __builtin_LINE()) {
    unit.LogAt(line, "%s:%d Failed to cp -f %s to %s. %m", from, to);
}

// Without copy_fn, a file that has been moved is then copied, which cannot find it any more: what
// the copy says, a positive status, is no failure.
bool CarryFile(const CopyRequest& copy, const char* from, const char* to) {
    if (!IsMetadataOrMissing(to)) {
        LogNotCopied(from, to);
        return false;
    }
    if (copy.copy_fn != nullptr) {
        if (copy.copy_fn(from, to) >= 0) return true;
        LogNotCopied(from, to);
        return false;
    }
    if (copy.move != 0 && MLIBCExec("/bin/mv", "-f", from, to, nullptr) != 0) {
        LogNotCopied(from, to);
        return false;
    }
    if (MLIBCExec("/bin/cp", "-f", from, to, nullptr) >= 0) return true;
    LogNotCopied(from, to);
    return false;
}

void CarryEntry(const CopyRequest& copy, const dirent& entry, const char* src_dir,
                const char* dst_dir) {
    Path from;
    Join(from, src_dir, entry.d_name);
    if (IsRegular(entry, from)) {
        Path to;
        Join(to, dst_dir, entry.d_name);
        if (CarryFile(copy, from, to)) SetMetadataMode(to, kMode);
    }
    if (copy.move != 0 && kernel::Access(from, F_OK) == 0) RemoveTree(from);
}

// There is nowhere to carry the files of src_dir to.
void GiveUp(const CopyRequest& copy, const char* src_dir) {
    if (copy.move == 0) return;
    RemoveTree(src_dir);
    (void)EARemoveEADir(src_dir);
    if (copy.update_index != 0) (void)MAVOIndex(copy.dst, nullptr, kIndexLost);
    if (copy.update_file_index != 0) (void)MLIBMavoFileIndexAdd(copy.src, nullptr, kIndexLost);
}

// Carries the files over. src_dir becomes the directory they were in. False when that ends the
// whole copy.
bool CarryOver(const CopyRequest& copy, Path src_dir) {
    if (MAVOEADirPath(EA_FORM_FOLDER, copy.src, src_dir, kDerivedPathMax) != 0) return false;
    struct stat info;
    if (kernel::Lstat(src_dir, &info) != 0 || !S_ISDIR(info.st_mode)) return true;

    Path dst_dir;
    if (EAPrepareEADir(EA_FORM_FOLDER, copy.dst, dst_dir, kDerivedPathMax) != 0) {
        GiveUp(copy, src_dir);
        return false;
    }
    Folder folder(src_dir);
    if (!folder) {
        unit.Log("%s:%d Failed to opendir %s, reason = %s.", src_dir, strerror(errno));
        return false;
    }
    while (const dirent* const entry = folder.NextEntry()) {
        CarryEntry(copy, *entry, src_dir, dst_dir);
    }
    // What could not be read has not been carried.
    if (copy.move != 0 && !folder.failed()) RemoveTree(src_dir);
    return true;
}

// To an AppleDouble volume, from one whose files this much is known of.
void RemoveSourceStream(const CopyRequest& copy) {
    Path path;
    const int upgraded = MAVOEAUpgrade(copy.src, MAVOEA_KIND_STREAM);
    if ((upgraded == 0 || upgraded == 1) &&
        MAVOEAPath(EA_FORM_FILE, copy.src, MAVOEA_KIND_STREAM, path, kDerivedPathMax,
                   EA_PLACE_EADIR) == 0) {
        (void)kernel::Unlink(path);
    }
    if (copy.copy_eadir == 0 &&
        MAVOEADirPath(EA_FORM_FOLDER, copy.src, path, kDerivedPathMax) == 0) {
        RemoveTree(path);
    }
}

}  // namespace

void RemoveTree(const char* path, int line) {
    if (MLIBCExec("/bin/rm", "-rf", path, nullptr) < 0) {
        unit.LogAt(line, "%s:%d Failed to rm -rf %s. %m", path);
    }
}

void FinishCopy(CopyRequest copy) {
    const VolumeKind src = VolumeKindOf(copy.src_type);
    const VolumeKind dst = VolumeKindOf(copy.dst_type);
    Path clean = "";  // a path in the EA directory that the move may have left empty
    bool keep_resource = false;
    if (src != VolumeKind::kAppleDouble && dst != VolumeKind::kAppleDouble) {
        copy.copy_eadir = 1;
        keep_resource = true;
    } else if (src == VolumeKind::kEADir) {
        if (MAVOEAPath(EA_FORM_FILE, copy.src, MAVOEA_KIND_RESOURCE, clean, kDerivedPathMax,
                       EA_PLACE_EADIR) != 0) {
            unit.Log("%s:%d Fail to generate path of %s.", copy.src);
            return;
        }
    }
    if (copy.move != 0) {
        if (dst == VolumeKind::kAppleDouble && (copy.src_type == 1 || copy.src_type == 10)) {
            RemoveSourceStream(copy);
        }
        // Sources of other kinds have no such path; that there is none is recorded all the same.
        if (!keep_resource && kernel::Unlink(clean) != 0) unit.Fail(Err::kSystemCall);
    }
    if (copy.copy_eadir != 0 && !CarryOver(copy, clean)) return;
    if (copy.move != 0 && *clean != '\0') (void)EARemoveEADir(clean);
    (void)EASetSmbArchive(copy.dst);
}

}  // namespace mavoea

// Copies metadata files from one EA directory to another.

#include <errno.h>
#include <fcntl.h>
#include <unistd.h>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "ops/ea_copy.h"
#include "ops/ea_copy_adouble.h"
#include "platform/include/mavocore.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/path_text.h"

namespace mavoea {
namespace {

constexpr Unit unit = copy_unit;

constexpr mode_t kMode = 0777;

// Whether the file is gone, now or before.
bool Removed(const char* path) { return kernel::Unlink(path) == 0 || errno == ENOENT; }

}  // namespace

int EAPrepareEADir(int mode, const char* szPath, char* szBuf, int cbBuf, bool* made) {
    if (szPath == nullptr || szBuf == nullptr || cbBuf <= 0) return -1;
    if (MAVOEADirPath(mode, szPath, szBuf, cbBuf) != 0) {
        unit.Log("%s:%d Failed to get EA path of %s.\n", szPath);
        return -1;
    }
    const bool missing = kernel::Access(szBuf, F_OK) != 0;
    if (made != nullptr) *made = missing;
    if (missing) return MAVOEAMKDir(mode == 0 ? 1 : 0, szBuf);
    if (mode == 1) return 0;
    if (MLIBCExec("/bin/rm", "-rf", szBuf, nullptr) < 0) {
        unit.Log("%s:%d Failed to rm -rf %s.\n", szBuf);
        return -1;
    }
    return MAVOEAMKDir(0, szBuf);
}

int EACopySidecar(const char* src, const char* dst, const char* name, int move, CopyFn copyFn) {
    char from[kPathBufferSize];
    char to[kPathBufferSize];
    char dir[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, src, name, from, kDerivedPathMax, EA_PLACE_EADIR) != 0) return -1;
    const bool is_file = LookAt(from) == Found::kFile;
    if (!is_file && kernel::Access(from, F_OK) != 0) return 0;
    if (MAVOEAPath(EA_FORM_FILE, dst, name, to, kDerivedPathMax, EA_PLACE_EADIR) != 0) return -1;

    // A file that is there lies in a directory that is. While one was made, anything may have been
    // put in both places.
    const Found target = LookAt(to);
    bool made = false;
    if (target != Found::kFile && EAPrepareEADir(1, dst, dir, kDerivedPathMax, &made) != 0) {
        return -1;
    }
    const auto copied = [&] {
        const bool seen = is_file && target != Found::kOther && !made;
        if (!seen && !AreMetadataOrMissing(from, to)) return -1;
        return copyFn != nullptr ? copyFn(from, to) : MLIBCExec("/bin/cp", "-f", from, to, nullptr);
    };
    if (copied() < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp -f %s %s. %m", from, to);
        return -1;
    }
    if (move != 0 && !Removed(from)) return unit.Fail(Err::kSystemCall);
    // A file that was there has mostly kept the mode of an earlier copy.
    if (target != Found::kFile || !HasMetadataMode(to, kMode)) SetMetadataMode(to, kMode);
    return 0;
}

int EACopyEADirFSToEADirFS(const char* src, const char* dst, int move, CopyFn copyFn) {
    if (EACopySidecar(src, dst, MAVOEA_KIND_RESOURCE, move, copyFn) < 0 ||
        EACopySidecar(src, dst, MAVOEA_KIND_STREAM, move, copyFn) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
        return -1;
    }
    return 0;
}

int EACopyEADirFSToFileEAFS(const char* src, const char* dst, int move, CopyFn copyFn) {
    char from[kPathBufferSize];
    char to[kPathBufferSize];
    char dir[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, src, MAVOEA_KIND_RESOURCE, from, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0) {
        unit.Log("%s:%d Fail to generate path of %s.", src);
        return -1;
    }
    if (kernel::Access(from, F_OK) != 0) return 0;  // The stream is not copied either.
    if (EAPrepareEADir(1, dst, dir, kDerivedPathMax) != 0 ||
        MAVOEAPath(EA_FORM_FILE, dst, MAVOEA_KIND_RESOURCE, to, kDerivedPathMax, EA_PLACE_EADIR) !=
            0) {
        unit.Log("%s:%d Fail to generate path of %s.", dst);
        return -1;
    }
    const int converted = EACopyAdoubleV2(from, to, kRewriteChecked);
    if (converted < 0) {
        unit.Log("%s:%d Failed to copy %s to %s, reason = %d.\n", from, to, converted);
        return -1;
    }
    if (move != 0 && !Removed(from)) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to remove [%s]. %m", from);
        return -1;
    }
    if (EACopySidecar(src, dst, MAVOEA_KIND_STREAM, move, copyFn) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
        return -1;
    }
    if (MAVOEAFileEAFSFinfoEASync(dst, 0) < 0) {
        // The text of the other direction; logs are searched for it.
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed file sync [%s]->[%s]. %m", src, dst);
        return -1;
    }
    if (MAVOEAFileEAWriteFlushTime(dst, 0) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed ea write time [%s]->[%s]. %m", src, dst);
        return -1;
    }
    return 0;
}

int EARemoveSrcResource(const char* src) {
    char path[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, src, MAVOEA_KIND_RESOURCE, path, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0) {
        unit.Log("%s:%d Fail to generate path of %s.", src);
        return -1;
    }
    return Removed(path) ? 0 : unit.Fail(Err::kSystemCall);
}

int RemoveSrcRecord(const char* src) {
    if (kernel::Removexattr(src, kNetatalkAttribute) == 0 || errno == ENODATA || errno == ENOENT) {
        return 0;
    }
    unit.LogWrapped("%s:%d [0x%04X %s:%d]remove xattr from [%s] %m", src);
    return -1;
}

}  // namespace mavoea

// Copies to and from the "._" files of AppleDouble volumes.

#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <unistd.h>

#include "adouble/internal.h"
#include "include/mavoea.h"
#include "ops/ea_copy.h"
#include "ops/ea_copy_adouble.h"
#include "platform/include/mavocore.h"
#include "stream/internal.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/volume_kind.h"

namespace mavoea {
namespace {

constexpr Unit unit = copy_unit;

constexpr mode_t kMode = 0777;

using Path = char[kPathBufferSize];

bool NameTooLong() { return MLIBCErrGet() == MAVOEA_ERR_NAME_TOO_LONG; }

// Removes the "._" file of a move's source; a missing one is as good.
int RemoveAppleDouble(const char* path) {
    if (kernel::Unlink(path) == 0 || errno == ENOENT) return 0;
    unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to remove [%s]. %m", path);
    return -1;
}

// Removes a metadata file of a move's source from its EA directory; a missing one is as good.
int RemoveFile(const char* path) {
    return kernel::Unlink(path) == 0 || errno == ENOENT ? 0 : unit.Fail(Err::kSystemCall);
}

// The attributes of the "._" file into dst's stream. 0, -1 or -2.
int AttributesFromAppleDouble(const char* src, const char* dst) {
    Path path;
    if (MAVOEAADPath(src, path, kDerivedPathMax) != 0) return -1;
    const UniqueFd from(kernel::OpenToRead(path));
    if (!from) return errno == ENOENT ? 0 : unit.Fail(Err::kOpen);
    const int count = EASGetEntryCount(from.get());
    if (count <= 0) return count;

    const UniqueFd to(MAVOEAOpen(EA_FORM_FILE, dst, MAVOEA_KIND_STREAM,
                                 O_RDWR | O_CREAT | O_CLOEXEC, EA_PLACE_EADIR));
    if (!to) {
        if (errno == ENOENT) return -1;
        unit.Fail(Err::kOpen);
        return -2;
    }
    if (EASWriteToFd(from.get(), to.get()) != 0) return -2;
    (void)kernel::Fchmod(to.get(), kMode);
    return 0;
}

// The attributes of src's stream into the "._" file of dst. 0, -1 or -2.
int AttributesToAppleDouble(const char* src, const char* dst) {
    const UniqueFd from(
        MAVOEAOpen(EA_FORM_FILE, src, MAVOEA_KIND_STREAM, O_RDONLY | O_CLOEXEC, EA_PLACE_EADIR));
    if (!from) return errno == ENOENT ? 0 : unit.Fail(Err::kOpen);
    const int count = EASGetEntryCount(from.get());
    if (count <= 0) return count;

    Path path;
    if (MAVOEAADPath(dst, path, kDerivedPathMax) != 0) {
        return errno == ENOENT ? -1 : unit.Fail(Err::kOpen);
    }
    UniqueFd to(kernel::OpenRegular(path, O_RDWR | O_CLOEXEC, kMode));
    if (!to) to.Reset(kernel::OpenRegular(path, O_RDWR | O_CREAT | O_CLOEXEC, kMode));
    if (!to) return errno == ENOENT ? -1 : unit.Fail(Err::kOpen);
    return EASWriteToFd(from.get(), to.get()) == 0 ? 0 : -2;
}

}  // namespace

int EACopyADFStoADFS(const char* src, const char* dst, int move) {
    Path from;
    Path to;
    if (MAVOEAADPath(src, from, kDerivedPathMax) != 0 ||
        MAVOEAADPath(dst, to, kDerivedPathMax) != 0) {
        if (!NameTooLong()) return -1;
        unit.Log("%s:%d filename too long: [%s].", src);
        unit.Log("%s:%d filename too long: [%s].", dst);
        return kCopyNameTooLong;
    }
    if (!AreMetadataOrMissing(from, to) || MLIBCExec("/bin/cp", "-f", from, to, nullptr) < 0) {
        unit.Log("%s:%d(%s) Failed to cp -f %s.\n", "EACopyADFStoADFS", from);
        return -1;
    }
    return move != 0 ? RemoveAppleDouble(from) : 0;
}

int EACopyADFSToEADirFS(const char* src, const char* dst, int move) {
    const auto cannot_derive = [&](const char* path) {
        if (NameTooLong()) {
            unit.Log("%s:%d filename too long: [%s].", path);
            return kCopyNameTooLong;
        }
        unit.Log("%s:%d Fail to generate path.[0x%04X %s:%d]", MLIBCErrGet(), MLIBCErrorGetFile(),
                 MLIBCErrorGetLine());
        return -1;
    };
    Path from;
    if (MAVOEAADPath(src, from, kDerivedPathMax) != 0) return cannot_derive(src);
    if (kernel::Access(from, F_OK) == 0 || errno != ENOENT) {
        Path dir;
        Path to;
        if (EAPrepareEADir(1, dst, dir, kDerivedPathMax) != 0 ||
            MAVOEAPath(EA_FORM_FILE, dst, MAVOEA_KIND_RESOURCE, to, kDerivedPathMax,
                       EA_PLACE_EADIR) != 0) {
            return cannot_derive(dst);
        }
        const int converted = EACopyAdoubleV2(from, to, kRewrite);
        if (converted < 0) {
            unit.Log("%s:%d Failed to copy %s to %s, reason = %d.\n", from, to, converted);
            return -1;
        }
        if (AttributesFromAppleDouble(src, dst) < 0) {
            unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
            return -1;
        }
    }
    return move != 0 ? RemoveAppleDouble(from) : 0;
}

int EACopyFromADFS(const char* src, const char* dst, int move, int dstFSType) {
    switch (VolumeKindOf(dstFSType)) {
        case VolumeKind::kAppleDouble:
            return EACopyADFStoADFS(src, dst, move);
        case VolumeKind::kAttribute:
            if (EACopyEAStreamToXattr(src, dst, move, EA_PLACE_APPLEDOUBLE) < 0) {
                unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
                return -1;
            }
            kernel::Sync();
            return 0;
        case VolumeKind::kEADir:
            return EACopyADFSToEADirFS(src, dst, move);
        case VolumeKind::kFileEA:
            if (EACopyADFSToEADirFS(src, dst, move) < 0) return -1;
            if (MAVOEAFileEAFSFinfoEASync(dst, 0) < 0) {
                unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed ea sync [%s]->[%s]. %m", src, dst);
                return -1;
            }
            if (MAVOEAFileEAWriteFlushTime(dst, 0) < 0) {
                unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed ea write time [%s]->[%s]. %m", src,
                                dst);
                return -1;
            }
            return 0;
        case VolumeKind::kDestinationOnly:
        case VolumeKind::kNone:
            break;
    }
    return kCopyUnsupported;
}

int EACopyToADFS(const char* src, const char* dst, int move) {
    Path resource;
    Path apple_double;
    Path safe;
    if (MAVOEAPath(EA_FORM_FILE, src, MAVOEA_KIND_RESOURCE, resource, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0) {
        unit.Log("%s:%d Fail to generate path of %s.", src);
        return -1;
    }
    if (MAVOEAADPath(dst, apple_double, MAVOEA_PATH_SIZE) != 0) {
        if (NameTooLong()) {
            unit.Log("%s:%d filename too long: [%s].", dst);
            return kCopyNameTooLong;
        }
        unit.Log("%s:%d Fail to generate path of %s.", dst);
        return -1;
    }
    if (MAVOStrReplaceFATReservedChar(apple_double, safe, kDerivedPathMax) < 0) return -1;
    const int converted = EACopyAdoubleV2(resource, safe, kRewriteChecked);
    if (converted < 0) {
        unit.Log("%s:%d Failed to copy %s to %s, reason = %d.", resource, safe, converted);
        return converted;
    }
    if (move != 0 && RemoveFile(resource) != 0) return -1;

    if (AttributesToAppleDouble(src, dst) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
        return -1;
    }
    if (move == 0) return 0;
    Path stream;
    if (MAVOEAPath(EA_FORM_FILE, src, MAVOEA_KIND_STREAM, stream, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0) {
        return -1;
    }
    return RemoveFile(stream);
}

int EACopyFileEAFSToADFS(const char* src, const char* dst, int move) {
    if (EAFileEAFSFinfoFileSync(src) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed file sync [%s]->[%s]. %m", src, dst);
        return -1;
    }
    if (EACopyToADFS(src, dst, move) < 0) {
        unit.LogWrapped("%s:%d [0x%04X %s:%d]Failed to cp [%s]->[%s]. %m", src, dst);
        return -1;
    }
    return move != 0 ? RemoveSrcRecord(src) : 0;
}

}  // namespace mavoea

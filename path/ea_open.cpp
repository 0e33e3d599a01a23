// Opens metadata files, and makes the EA directory where one is to be created.

#include "path/ea_open.h"

#include <errno.h>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "platform/kernel.h"
#include "util/metadata_file.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_open");

constexpr mode_t kMode = 0777;

int OpenAppleDouble(int form, const char* szPath, const char* szName, int oflag) {
    if (szPath == nullptr || szName == nullptr) {
        errno = ENOENT;
        return unit.Fail(Err::kBadArgument);
    }
    char path[kPathBufferSize];
    if (MAVOEAPath(form, szPath, szName, path, MAVOEA_PATH_SIZE, EA_PLACE_APPLEDOUBLE) != 0) {
        return -1;
    }
    const int fd = kernel::OpenRegular(path, oflag & ~O_CREAT, kMode);
    if (fd >= 0 || errno != ENOENT) return fd;
    return kernel::OpenRegular(path, oflag, kMode);
}

// Whether an upgrade that has just failed may have left something that a new file would hide. It
// has not when only the emptied folder could not be removed, and when there is no earlier layout of
// the kind, or none of a path that long.
bool MayHaveLeftSomething() {
    const int code = MLIBCErrGet();
    return code != MAVOEA_ERR_REMOVE && code != MAVOEA_ERR_BAD_ARGUMENT &&
           code != MAVOEA_ERR_NAME_TOO_LONG;
}

// Makes the directory of a metadata file in that form.
int MakeEADir(int form, const char* szPath) {
    char dir[kPathBufferSize];
    if (MAVOEADirPath(form, szPath, dir, MAVOEA_PATH_SIZE) != 0) return -1;
    return MAVOEAMKDir(form == EA_FORM_FOLDER, dir);
}

// With `made`, that is told of OpenOrMake().
int OpenInEADir(int form, const char* szPath, const char* szName, int oflag, bool* made) {
    if (szPath == nullptr || szName == nullptr) {
        errno = ENOENT;
        return unit.Fail(Err::kBadArgument);
    }
    char path[kPathBufferSize];
    if (MAVOEAPath(form, szPath, szName, path, MAVOEA_PATH_SIZE, EA_PLACE_EADIR) != 0) return -1;

    const bool creates = (oflag & O_CREAT) != 0;
    if (form == EA_FORM_FOLDER) {
        if (creates && MakeEADir(form, szPath) != 0) return -1;
        return kernel::OpenRegular(path, oflag, kMode);
    }

    // Where the file is, its directory need not be made, by who could make it.
    const bool at_once = !creates || kernel::Geteuid() == 0;
    int fd = at_once ? kernel::OpenRegular(path, oflag & ~O_CREAT, kMode) : -1;
    if (fd < 0 && creates) {
        const int error = errno;
        if (MakeEADir(form, szPath) != 0) return -1;
        errno = error;
        if (!at_once) fd = kernel::OpenRegular(path, oflag & ~O_CREAT, kMode);
    }
    if (fd >= 0 || errno != ENOENT) return fd;
    // Before it is missed, or made empty, it is looked for where earlier versions kept it.
    bool nowhere = false;
    const int upgraded = form == EA_FORM_FILE
                             ? UpgradeMissed(szPath, szName, creates ? nullptr : &nowhere)
                             : MAVOEAUpgrade(szPath, szName);
    if (nowhere || (upgraded == -1 && creates && MayHaveLeftSomething())) return -1;
    if (made != nullptr) return OpenOrMake(path, made);
    return kernel::OpenRegular(path, oflag, kMode);
}

}  // namespace

int OpenOrMakeMetadata(const char* szPath, const char* szName, bool* made) {
    *made = false;
    return OpenInEADir(EA_FORM_FILE, szPath, szName, O_RDWR | O_CREAT | O_CLOEXEC, made);
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEAOpenNoADFS(int form, const char* szPath, const char* szName, int oflag) {
    return OpenInEADir(form, szPath, szName, oflag, nullptr);
}

int MAVOEAOpen(int form, const char* szPath, const char* szName, int oflag, int place) {
    switch (place) {
        case EA_PLACE_EADIR:
            return MAVOEAOpenNoADFS(form, szPath, szName, oflag);
        case EA_PLACE_APPLEDOUBLE:
            return OpenAppleDouble(form, szPath, szName, oflag);
        default:
            return unit.Fail(Err::kBadArgument);
    }
}

// Repairs a resource file that holds attributes: they belong into the object's stream.

#include <errno.h>
#include <string.h>

#include <string_view>

#include "include/mavoea.h"
#include "ops/ea_copy_adouble.h"
#include "stream/internal.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_fix_error_ad");

// What replaces a file is on disk before. There is nothing of an empty file.
bool Sync(const char* path) {
    const UniqueFd fd(kernel::OpenRegular(path, O_RDONLY | O_CLOEXEC, 0));
    if (!fd && errno == ENOENT) return true;
    return (fd && kernel::Fsync(fd.get()) == 0) || unit.Fail(Err::kSystemCall) == 0;
}

// The attributes of the resource file `file` into the stream of the object at `path`.
bool MoveAttributes(const char* file, const char* path) {
    const UniqueFd from(kernel::OpenRegular(file, O_RDONLY | O_CLOEXEC, 0));
    if (!from) return false;
    const int count = EASGetEntryCount(from.get());
    if (count <= 0) return count == 0;
    const UniqueFd to(
        MAVOEAOpen(EA_FORM_FILE, path, MAVOEA_KIND_STREAM, O_RDWR | O_CREAT, EA_PLACE_EADIR));
    return to && EASWriteToFd(from.get(), to.get()) == 0;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAFixErrorAD(const char* path) {
    constexpr int kBufferSize = 4095;
    char file[kPathBufferSize] = {};
    if (MAVOEAPath(EA_FORM_FILE, path, MAVOEA_KIND_RESOURCE, file, kBufferSize, EA_PLACE_EADIR) !=
        0) {
        return -1;
    }
    constexpr std::string_view kTemporary = "Tmp";
    if (strlen(file) + kTemporary.size() >= kBufferSize) {
        errno = ENAMETOOLONG;  // Cut short, it might be another file's path.
        return -1;
    }
    char rewritten[kBufferSize];
    CutShort(rewritten, kBufferSize).Add(file).Add(kTemporary);

    // Everybody may make files here: what is in the way is not written through.
    (void)kernel::Unlink(rewritten);
    if (EACopyAdoubleV2(file, rewritten, kRewrite) != 0 || !MoveAttributes(file, path) ||
        !Sync(rewritten)) {
        const ErrnoKeeper keep;
        (void)kernel::Unlink(rewritten);
        return -1;
    }
    (void)kernel::Rename(rewritten, file);
    return 0;
}

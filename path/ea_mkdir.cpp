// Creates EA directories, which every user of the share must be able to use whatever the rights of
// the process that happens to make them.

#include <errno.h>
#include <string.h>

#include "include/mavoea.h"
#include "platform/include/mavoacl.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/superuser_scope.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_mkdir.c");

constexpr mode_t kMode = 0777;

// Volumes of this type keep Finder info as a real attribute.
constexpr int kAttributeVolume = 7;

// Finder info of a folder: the big-endian folder flags at byte 8 have the invisible bit, 0x4000.
constexpr unsigned char kInvisible[32] = {0, 0, 0, 0, 0, 0, 0, 0, 0x40};

// Creates one directory; one that exists is left as it is. `parent` is the directory that holds it
// when this process has just made that too, so that no link put there since leads elsewhere;
// otherwise AT_FDCWD. *made is the new directory, empty when it existed.
int MakeDirectory(const char* path, int parent, UniqueFd* made) {
    const char* const name = parent == AT_FDCWD ? path : strrchr(path, '/') + 1;
    if (kernel::MkdirAt(parent, name, kMode) != 0) {
        return errno == EEXIST ? 0 : unit.Fail(Err::kMakeDirectory);
    }
    made->Reset(kernel::OpenAt(parent, name,
                               O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK, 0));
    if (!*made) {
        // Without its mode and ACL it would be of no use to others for good: later calls leave it
        // as it is. It stays if somebody has used it meanwhile.
        const ErrnoKeeper keep;
        (void)kernel::UnlinkAt(parent, name, AT_REMOVEDIR);
        return unit.Fail(Err::kSystemCall);
    }
    // The umask must not narrow the mode.
    if (kernel::Fchmod(made->get(), kMode) != 0) return unit.Fail(Err::kSystemCall);

    // Somebody else may have put a link in its place, through which the superuser must not be led.
    if (MAVOGetFSType(path, 0) == kAttributeVolume) {
        if (!Names(path, made->get()) ||
            MAVOEAXattrSet(path, "com.apple.FinderInfo", kInvisible, sizeof kInvisible, 0) != 0) {
            return unit.Fail(Err::kSystemCall);
        }
    }
    if (!Names(path, made->get())) return unit.Fail(Err::kSystemCall);
    MAVOACLSetEADirACL(path);
    return 0;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAMKDir(int blParentFirst, const char* szEADirPath) {
    if (szEADirPath == nullptr) return unit.FailCheck("((void *)0) != szEADirPath");

    const SuperuserScope superuser;
    if (!superuser.ok()) return unit.Fail(Err::kMakeDirectory);

    const std::size_t size = strlen(szEADirPath) + 1;
    const auto path = Owned<char>::Allocate(size);
    if (!path) return unit.Fail(Err::kBufferMemory);
    memcpy(path.get(), szEADirPath, size);

    UniqueFd parent;
    if (blParentFirst != 0) {
        char* const slash = strrchr(path.get(), '/');
        if (slash == nullptr) return unit.Fail(Err::kBadArgument);
        *slash = '\0';
        if (MakeDirectory(path.get(), AT_FDCWD, &parent) != 0) return -1;
        *slash = '/';
    }
    // A path that ends in '/' names the parent again.
    const bool inside = parent && path.get()[size - 2] != '/';
    UniqueFd made;
    return MakeDirectory(path.get(), inside ? parent.get() : AT_FDCWD, &made);
}

// Repairs a resource file that holds attributes: they belong into the object's stream.

#include <errno.h>
#include <string.h>

#include <string_view>

#include "include/mavoea.h"
#include "ops/ea_copy_adouble.h"
#include "stream/internal.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

bool LockForWriting(int fd) {
    EASHandle h = {};
    h.fd = fd;
    h.lockType = F_UNLCK;
    return MAVOEASLockSet(&h, F_WRLCK) == 0;
}

// The file that is to take the resource file's place. Its lock tells other repairs that it is being
// written. It goes with its scope unless it has taken that place.
class Replacement {
 public:
    explicit Replacement(const char* path) : path_(path) {
        for (int tries = kOpenTries; tries > 0; --tries) {
            file_.Reset(kernel::OpenRegular(path, O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
            if (!file_ && errno != EEXIST) {
                EARewriteNotOpened(path);
                return;
            }
            if (!file_) {
                if (!ClearTheWay()) return;
            } else if (!LockForWriting(file_.get())) {
                file_.Reset(-1);
                return;
            } else if (Names(path, file_.get())) {
                return;
            }
            // Another repair has taken it for one that nobody writes any more.
            file_.Reset(-1);
        }
        errno = EAGAIN;
    }
    ~Replacement() {
        const ErrnoKeeper keep;
        if (file_ && Names(path_, file_.get())) (void)kernel::Unlink(path_);
    }
    Replacement(const Replacement&) = delete;
    Replacement& operator=(const Replacement&) = delete;

    explicit operator bool() const { return static_cast<bool>(file_); }
    int fd() const { return file_.get(); }

    // Takes the place of `file`, once it is on disk. There is nothing of an empty file.
    bool TakePlaceOf(const char* file) const {
        const off_t size = kernel::Lseek(fd(), 0, SEEK_END);
        if (size == 0) return true;
        if (size < 0 || kernel::Fsync(fd()) != 0 || !Names(path_, fd())) return false;
        (void)kernel::Rename(path_, file);
        return true;
    }

 private:
    // Whether nothing is in the way any more. Everybody may make files here: what is no file of a
    // repair's is not opened, and none is written through.
    bool ClearTheWay() const {
        struct stat info;
        if (kernel::Lstat(path_, &info) != 0) return errno == ENOENT || NotOpened();
        UniqueFd left;
        if (S_ISREG(info.st_mode) && info.st_nlink == 1) {
            left.Reset(kernel::OpenRegular(path_, O_RDWR | O_CLOEXEC, 0));
            if (!left) return errno == ENOENT || NotOpened();
            if (!LockForWriting(left.get())) return false;
            if (!Names(path_, left.get())) return true;
        }
        return kernel::Unlink(path_) == 0 || errno == ENOENT || NotOpened();
    }

    bool NotOpened(int line = __builtin_LINE()) const {
        return EARewriteNotOpened(path_, line) == 0;
    }

    const char* path_;
    UniqueFd file_;
};

// The attributes of the resource file `file` into the stream of the object at `path`.
bool MoveAttributes(const char* file, const char* path) {
    const UniqueFd from(kernel::OpenToRead(file));
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

    // Where there is nothing to repair nothing is made.
    struct stat info;
    if (kernel::Lstat(file, &info) != 0) return -1;
    const Replacement replacement(rewritten);
    if (!replacement || EARewriteAdouble(file, rewritten, replacement.fd()) != 0 ||
        !MoveAttributes(file, path)) {
        return -1;
    }
    return replacement.TakePlaceOf(file) ? 0 : -1;
}

#include "tools/sidecar.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <exception>

#include "tools/messages.h"

namespace mavoea::tool {
namespace {

// Negative with the library's reasons in *error.
int TryToOpen(const Sidecar& sidecar, int flags, LibraryError* error) {
    const ErrorMark mark;
    const int fd = MAVOEAOpen(EA_FORM_FILE, sidecar.object.c_str(), sidecar.kind, flags | O_CLOEXEC,
                              sidecar.place);
    if (fd < 0) *error = mark.Get();
    return fd;
}

}  // namespace

std::string Sidecar::Path() const {
    std::string path(MAVOEA_PATH_SIZE + 1, '\0');
    const ErrorMark mark;
    if (MAVOEAPath(EA_FORM_FILE, object.c_str(), kind, path.data(), MAVOEA_PATH_SIZE, place) != 0) {
        throw LibraryFailure(object, mark.Get());
    }
    path.resize(path.find('\0'));
    return path;
}

std::optional<File> Sidecar::Open(Access access) const {
    const std::string path = Path();
    LibraryError error;
    int fd = TryToOpen(*this, access == Access::kRead ? O_RDONLY : O_RDWR, &error);
    if (fd < 0 && error.error == ENOENT) {
        // Only making files takes the superuser, for their directory.
        if (access != Access::kCreate) return std::nullopt;
        fd = TryToOpen(*this, O_RDWR | O_CREAT, &error);
    }
    if (fd < 0) throw LibraryFailure(path, error);
    return File(fd, path);
}

FileLock::FileLock(const File& file, Access access) : holder_{} {
    holder_.fd = file.fd();
    holder_.lockType = F_UNLCK;
    const ErrorMark mark;
    if (MAVOEASLockSet(&holder_, access == Access::kRead ? F_RDLCK : F_WRLCK) != 0) {
        throw LibraryFailure(file.path(), mark.Get());
    }
}

FileLock::~FileLock() { (void)MAVOEASLockSet(&holder_, F_UNLCK); }

RemoveIfFailed::RemoveIfFailed(const File& file, Access access)
    : file_(file),
      is_new_(access == Access::kCreate && file.Size() == 0),
      exceptions_(std::uncaught_exceptions()) {}

RemoveIfFailed::~RemoveIfFailed() {
    if (is_new_ && std::uncaught_exceptions() > exceptions_) {
        (void)::unlink(file_.path().c_str());
    }
}

}  // namespace mavoea::tool

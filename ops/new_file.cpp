#include "ops/new_file.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>

#include "platform/kernel.h"

namespace mavoea {
namespace {

// Through these a file without a name gets one.
constexpr char kDescriptors[] = "/proc/self/fd";

// As the tool's own temporary files are called, so that it removes what a crash leaves.
constexpr char kTemporaryName[] = "/.mavoea-%08x";
constexpr std::size_t kTemporaryNameSize = sizeof "/.mavoea-12345678";

}  // namespace

NewFile::NewFile(std::string_view directory, mode_t mode) {
    if (kernel::Access(kDescriptors, F_OK) == 0) {
        char path[kPathBufferSize];
        CutShort(path, sizeof path).Add(directory);
        fd_.Reset(kernel::Open(path, O_TMPFILE | O_RDWR | O_CLOEXEC, mode));
    }
    if (!fd_) MakeWithName(directory, mode);
}

NewFile::~NewFile() {
    const ErrnoKeeper keep;
    if (*temporary_ != '\0') (void)kernel::Unlink(temporary_);
}

void NewFile::MakeWithName(std::string_view directory, mode_t mode) {
    // More than this many have not been left over by processes of this one's number.
    constexpr unsigned kAttempts = 64;
    const unsigned first = static_cast<unsigned>(kernel::Getpid()) * kAttempts;
    for (unsigned i = 0; i < kAttempts; ++i) {
        char name[kTemporaryNameSize];
        snprintf(name, sizeof name, kTemporaryName, first + i);
        CutShort(temporary_, sizeof temporary_).Add(directory).Add(name);
        fd_.Reset(kernel::Open(temporary_, O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, mode));
        if (fd_) return;
        if (errno != EEXIST) break;
    }
    *temporary_ = '\0';
}

bool NewFile::Name(const char* path) {
    if (*temporary_ == '\0') {
        char self[sizeof kDescriptors + sizeof "/2147483647"];
        snprintf(self, sizeof self, "%s/%d", kDescriptors, fd());
        return kernel::Link(self, path, AT_SYMLINK_FOLLOW) == 0;
    }
    if (kernel::Link(temporary_, path, 0) == 0) return true;
    if (errno == EEXIST) return false;
    // A file system without links.
    if (kernel::Access(path, F_OK) == 0) {
        errno = EEXIST;
        return false;
    }
    if (kernel::Rename(temporary_, path) != 0) return false;
    *temporary_ = '\0';
    return true;
}

}  // namespace mavoea

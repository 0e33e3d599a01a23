#include "tools/place/file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "tools/say/messages.h"

namespace mavoea::tool {

File::~File() {
    if (fd_ >= 0) ::close(fd_);
}

File::File(File&& other) noexcept
    : fd_(std::exchange(other.fd_, -1)),
      path_(std::move(other.path_)),
      seen_size_(other.seen_size_),
      contents_(std::move(other.contents_)) {}

int OpenQuietly(int directory, const char* name, int flags) {
    const int fd = ::openat(directory, name, flags | O_NOATIME);
    if (fd >= 0 || errno != EPERM) return fd;  // Only owners may ask for that.
    return ::openat(directory, name, flags);
}

File File::OpenToRead(const std::string& path) {
    // Never waits for the other end of a FIFO.
    constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
    File file(OpenQuietly(AT_FDCWD, path.c_str(), kFlags), path);
    if (file.fd_ < 0) throw SystemFailure(path, errno);
    if (!S_ISREG(file.Status().st_mode)) {
        throw Failure(kFailed, path, "not a regular file",
                      "name a metadata file, mavoea where PATH has them");
    }
    return file;
}

File File::OpenAny(const std::string& path) {
    File file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY), path);
    if (file.fd_ < 0) throw SystemFailure(path, errno);
    return file;
}

struct stat File::Status() const {
    struct stat info;
    if (::fstat(fd_, &info) != 0) throw SystemFailure(path_, errno);
    seen_size_ = static_cast<std::uint64_t>(info.st_size);
    return info;
}

std::uint64_t File::Size() const {
    return contents_ ? contents_->size() : static_cast<std::uint64_t>(Status().st_size);
}

Bytes File::Read(std::uint64_t offset, std::uint64_t size) const {
    // How large the file is matters only where more would be taken than that could be.
    constexpr std::uint64_t kLittle = 4096;
    if (contents_ || size > kLittle) {
        const std::uint64_t file_size = Size();
        if (offset >= file_size) return {};
        size = std::min(size, file_size - offset);
    }
    if (contents_) {
        const ByteView part =
            ByteView(*contents_)
                .subspan(static_cast<std::size_t>(offset), static_cast<std::size_t>(size));
        return {part.begin(), part.end()};
    }
    Bytes bytes(static_cast<std::size_t>(size));
    bytes.resize(ReadAt(offset, bytes, bytes.size()));
    return bytes;
}

bool File::KeepContents(std::uint64_t most) const {
    contents_.reset();
    if (!seen_size_) (void)Status();
    for (;;) {
        const std::uint64_t size = *seen_size_;
        if (size > most) return false;
        // One byte more: the file may have grown since.
        Bytes bytes(static_cast<std::size_t>(size) + 1);
        bytes.resize(ReadAt(0, bytes, static_cast<std::size_t>(size)));
        if (bytes.size() <= size) {
            contents_ = std::move(bytes);
            return true;
        }
        (void)Status();
    }
}

// How much of `bytes` could be read: `enough` at least, but at the end of the file.
std::size_t File::ReadAt(std::uint64_t offset, std::span<std::uint8_t> bytes,
                         std::size_t enough) const {
    std::size_t done = 0;
    while (done < enough) {
        const ssize_t got = ::pread(fd_, bytes.data() + done, bytes.size() - done,
                                    static_cast<off_t>(offset + done));
        if (got < 0 && errno == EINTR) continue;
        if (got < 0) throw SystemFailure(path_, errno);
        if (got == 0) break;
        done += static_cast<std::size_t>(got);
    }
    return done;
}

void File::Write(std::uint64_t offset, ByteView bytes) const {
    contents_.reset();
    seen_size_ = std::max(seen_size_.value_or(0), offset + bytes.size());
    std::size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t put = ::pwrite(fd_, bytes.data() + done, bytes.size() - done,
                                     static_cast<off_t>(offset + done));
        if (put < 0 && errno == EINTR) continue;
        if (put <= 0) throw SystemFailure(path_, put < 0 ? errno : ENOSPC);
        done += static_cast<std::size_t>(put);
    }
}

void File::Append(ByteView bytes) const {
    while (!bytes.empty()) {
        const ssize_t put = ::write(fd_, bytes.data(), bytes.size());
        if (put < 0 && errno == EINTR) continue;
        if (put <= 0) throw SystemFailure(path_, put < 0 ? errno : ENOSPC);
        bytes = bytes.subspan(static_cast<std::size_t>(put));
    }
}

void File::Reserve(std::uint64_t offset, std::uint64_t size) const {
    if (size == 0) return;
    const std::uint64_t old_size = Size();
    const int error = ::posix_fallocate(fd_, static_cast<off_t>(offset), static_cast<off_t>(size));
    if (error == 0) return;
    Resize(old_size);
    throw SystemFailure(path_, error);
}

void File::Resize(std::uint64_t size) const {
    contents_.reset();
    seen_size_.reset();
    if (::ftruncate(fd_, static_cast<off_t>(size)) != 0) throw SystemFailure(path_, errno);
}

void File::Sync() const {
    if (::fsync(fd_) != 0) throw SystemFailure(path_, errno);
}

Bytes ReadToEnd(int fd, const std::string& name, std::uint64_t most) {
    constexpr std::size_t kStep = std::size_t{1} << 16;
    Bytes bytes;
    for (;;) {
        const std::size_t done = bytes.size();
        bytes.resize(done + kStep);
        const ssize_t got = ::read(fd, bytes.data() + done, kStep);
        const int error = errno;
        bytes.resize(done + static_cast<std::size_t>(std::max<ssize_t>(got, 0)));
        if (got < 0 && error == EINTR) continue;
        if (got < 0) throw SystemFailure(name, error);
        if (got == 0) return bytes;
        if (bytes.size() > most) {
            throw Failure(kFailed, name, "more than a value can hold", "use a smaller value");
        }
    }
}

}  // namespace mavoea::tool

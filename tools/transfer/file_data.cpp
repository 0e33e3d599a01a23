#include "tools/transfer/file_data.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "tools/say/job.h"
#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr std::uint64_t kPiece = std::uint64_t{16} << 20;
constexpr std::size_t kBufferSize = std::size_t{1} << 18;
constexpr std::size_t kBlockSize = 512;  // of st_blocks

Failure Changed(const File& from) {
    return {kFailed, from.path(), "it changed while it was copied", "copy it again"};
}

bool IsZero(ByteView bytes) {
    return std::all_of(bytes.begin(), bytes.end(), [](std::uint8_t byte) { return byte == 0; });
}

bool IsReadable(const File& file) { return (::fcntl(file.fd(), F_GETFL) & O_ACCMODE) != O_WRONLY; }

bool SameTime(const timespec& one, const timespec& other) {
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

// How many bytes were read, 0 at the end.
std::size_t ReadSome(const File& from, std::uint64_t at, ByteSpan buffer) {
    for (;;) {
        const ssize_t got =
            ::pread(from.fd(), buffer.data(), buffer.size(), static_cast<off_t>(at));
        if (got >= 0) return static_cast<std::size_t>(got);
        if (errno == EINTR) continue;
        throw Refusal("error reading " + Quoted(from.path()), errno);
    }
}

// Reads back what has been written, where that may be read.
void RequireWritten(const File& to, std::uint64_t at, ByteView bytes) {
    if (!IsReadable(to)) return;
    Bytes written(bytes.size());
    written.resize(ReadSome(to, at, written));
    if (std::equal(bytes.begin(), bytes.end(), written.begin(), written.end())) return;
    throw Failure(kFailed, to.path(), "what was written is not what is read back",
                  "check the disk");
}

// The next data or hole; file systems that know of no holes have data throughout.
std::uint64_t Seek(const File& from, std::uint64_t at, int what, std::uint64_t size) {
    if (at >= size) return size;
    const off_t found = ::lseek(from.fd(), static_cast<off_t>(at), what);
    if (found >= 0) return std::min(static_cast<std::uint64_t>(found), size);
    return what == SEEK_DATA && errno != ENXIO ? at : size;
}

}  // namespace

// ---- A large file, or one with holes ------------------------------------------------------------

class LargeCopy {
 public:
    LargeCopy(FileData* data, const File& from, std::uint64_t size, const File& to)
        : data_(*data), from_(from), size_(size), to_(to) {
        data_.buffer_.resize(kBufferSize);
        in_kernel_ = data_.sparse_ == Sparse::kAuto;
    }

    void Run() {
        std::uint64_t end = 0;
        for (std::uint64_t at = 0; at < size_; at = end) {
            at = data_.sparse_ == Sparse::kNever ? at : Seek(from_, at, SEEK_DATA, size_);
            end = data_.sparse_ == Sparse::kNever ? size_ : Seek(from_, at, SEEK_HOLE, size_);
            CopyRange(at, end);
        }
        // What has no size, as in /proc, or has grown meanwhile.
        end = ReadAndWrite(size_, ~std::uint64_t{0});
        if (size_ > 0 && end == size_) to_.Resize(size_);  // The hole at the end.
        if (end > size_ && data_.sparse_ == Sparse::kAlways) to_.Resize(end);
    }

 private:
    void CopyRange(std::uint64_t at, std::uint64_t end) {
        while (at < end && in_kernel_) {
            data_.Ask(from_);
            auto in = static_cast<off64_t>(at);
            off64_t out = in;
            const ssize_t copied =
                ::copy_file_range(from_.fd(), &in, to_.fd(), &out,
                                  static_cast<std::size_t>(std::min(end - at, kPiece)), 0);
            if (copied < 0 && errno == EINTR) continue;
            if (copied < 0 && (errno == ENOSPC || errno == EDQUOT || errno == EIO)) {
                throw SystemFailure(errno == EIO ? from_.path() : to_.path(), errno);
            }
            // Any other failure means that it does not work between these two.
            in_kernel_ = copied > 0;
            if (in_kernel_) {
                Compare(at, at + static_cast<std::uint64_t>(copied));
                at += static_cast<std::uint64_t>(copied);
                data_.watch_.on_bytes(static_cast<std::uint64_t>(copied));
            }
        }
        ReadAndWrite(at, end);
    }

    // Where it ended: the file may be shorter.
    std::uint64_t ReadAndWrite(std::uint64_t at, std::uint64_t end) {
        while (at < end) {
            data_.Ask(from_);
            const auto most = std::min<std::uint64_t>(end - at, kBufferSize);
            const std::size_t got =
                ReadSome(from_, at, ByteSpan(data_.buffer_.data(), static_cast<std::size_t>(most)));
            if (got == 0) break;
            Write(at, ByteView(data_.buffer_.data(), got));
            at += got;
            data_.watch_.on_bytes(got);
        }
        return at;
    }

    void Write(std::uint64_t at, ByteView bytes) const {
        constexpr std::size_t kHole = 4096;
        if (data_.sparse_ != Sparse::kAlways) {
            to_.Write(at, bytes);
            return RequireWritten(to_, at, bytes);
        }
        while (!bytes.empty()) {
            const ByteView piece = bytes.first(std::min(kHole, bytes.size()));
            if (!IsZero(piece)) {
                to_.Write(at, piece);
                RequireWritten(to_, at, piece);
            }
            at += piece.size();
            bytes = bytes.subspan(piece.size());
        }
    }

    // Reads both, since nobody has seen what the kernel copied.
    void Compare(std::uint64_t at, std::uint64_t end) const {
        if (!IsReadable(to_)) return;
        while (at < end) {
            const Bytes wanted = from_.Read(at, std::min<std::uint64_t>(end - at, kBufferSize));
            if (wanted.empty()) throw Changed(from_);
            RequireWritten(to_, at, wanted);
            at += wanted.size();
        }
    }

    FileData& data_;
    const File& from_;
    std::uint64_t size_;
    const File& to_;
    bool in_kernel_ = true;
};

// ---- FileData -----------------------------------------------------------------------------------

void FileData::Copy(const File& from, const File& to) {
    const struct stat info = from.Status();
    if (TryToShare(from, info, to)) return;
    if (!TryToCopySmall(from, info, to)) {
        LargeCopy(this, from, static_cast<std::uint64_t>(info.st_size), to).Run();
    }
    // What it lost is like a hole, and what has changed was seen half.
    const struct stat now = from.Status();
    if (info.st_size == 0 && now.st_size == 0) return;  // as in /proc
    if (now.st_size != info.st_size || !SameTime(now.st_mtim, info.st_mtim)) throw Changed(from);
}

void FileData::Foresee(const File& from) const {
    const std::uint64_t size = from.Size();
    std::uint64_t end = 0;
    for (std::uint64_t at = 0; at < size; at = end) {
        at = sparse_ == Sparse::kNever ? at : Seek(from, at, SEEK_DATA, size);
        end = sparse_ == Sparse::kNever ? size : Seek(from, at, SEEK_HOLE, size);
        watch_.on_bytes(end - at);
    }
}

bool FileData::TryToShare(const File& from, const struct stat& info, const File& to) {
    if (reflink_ == Reflink::kNever || (reflink_ == Reflink::kAuto && sparse_ != Sparse::kAuto)) {
        return false;
    }
    const std::pair<dev_t, dev_t> devices = {info.st_dev, to.Status().st_dev};
    if (reflink_ == Reflink::kAuto && (devices == apart_ || devices.first != devices.second)) {
        return false;
    }
    if (::ioctl(to.fd(), FICLONE, from.fd()) == 0) {
        watch_.on_bytes(static_cast<std::uint64_t>(info.st_size));
        return true;
    }
    if (reflink_ == Reflink::kAlways) {
        throw Refusal("failed to clone " + Quoted(to.path()) + " from " + Quoted(from.path()),
                      errno);
    }
    apart_ = devices;
    return false;
}

// All of it in one piece, where nothing suggests a hole.
bool FileData::TryToCopySmall(const File& from, const struct stat& info, const File& to) {
    const auto size = static_cast<std::uint64_t>(info.st_size);
    const bool whole = static_cast<std::uint64_t>(info.st_blocks) * kBlockSize >= size;
    if (size == 0 || size >= kBufferSize || !whole || sparse_ == Sparse::kAlways) return false;
    buffer_.resize(kBufferSize);
    // More than there should be: it may have grown.
    if (ReadSome(from, 0, buffer_) != size) throw Changed(from);
    const ByteView bytes(buffer_.data(), static_cast<std::size_t>(size));
    to.Write(0, bytes);
    RequireWritten(to, 0, bytes);
    watch_.on_bytes(size);
    return true;
}

void FileData::Ask(const File& from) const {
    if (!watch_.give_up()) return;
    throw Failure(kFailed, from.path(), "interrupted", "copy it again");
}

void FileData::CopyStream(const File& from, const File& to) {
    constexpr int kWait = 100;  // milliseconds
    buffer_.resize(kBufferSize);
    for (;;) {
        Ask(from);
        pollfd readable = {from.fd(), POLLIN, 0};
        const int ready = ::poll(&readable, 1, kWait);
        if (ready == 0 || (ready < 0 && errno == EINTR)) continue;
        const ssize_t got = ::read(from.fd(), buffer_.data(), buffer_.size());
        if (got < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (got < 0) throw Refusal("error reading " + Quoted(from.path()), errno);
        if (got == 0) return;
        to.Append(ByteView(buffer_.data(), static_cast<std::size_t>(got)));
        watch_.on_bytes(static_cast<std::uint64_t>(got));
    }
}

}  // namespace mavoea::tool

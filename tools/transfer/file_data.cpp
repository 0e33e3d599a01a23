#include "tools/transfer/file_data.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr std::uint64_t kPiece = std::uint64_t{16} << 20;
constexpr std::size_t kBufferSize = std::size_t{1} << 18;

class DataCopy {
 public:
    DataCopy(const File& from, const File& to, const DataWatch& watch)
        : from_(from), to_(to), watch_(watch) {}

    void Run() {
        const std::uint64_t size = from_.Size();
        if (::ioctl(to_.fd(), FICLONE, from_.fd()) == 0) {
            watch_.on_bytes(size);
            return;
        }
        std::uint64_t end = 0;
        for (std::uint64_t at = 0; at < size; at = end) {
            at = Seek(at, SEEK_DATA, size);
            end = Seek(at, SEEK_HOLE, size);
            CopyRange(at, end);
        }
        // What has no size, as in /proc, or has grown meanwhile.
        end = ReadAndWrite(size, ~std::uint64_t{0});
        if (size > 0 && end == size) to_.Resize(size);  // The hole at the end.
        Compare();
        if (from_.Size() < size) throw Changed();  // what it lost is like a hole
    }

 private:
    // The next data or hole; file systems that know of no holes have data throughout.
    std::uint64_t Seek(std::uint64_t at, int what, std::uint64_t size) const {
        if (at >= size) return size;
        const off_t found = ::lseek(from_.fd(), static_cast<off_t>(at), what);
        if (found >= 0) return std::min(static_cast<std::uint64_t>(found), size);
        return what == SEEK_DATA && errno != ENXIO ? at : size;
    }

    void CopyRange(std::uint64_t at, std::uint64_t end) {
        while (at < end && in_kernel_) {
            Ask();
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
                at += static_cast<std::uint64_t>(copied);
                watch_.on_bytes(static_cast<std::uint64_t>(copied));
            }
        }
        ReadAndWrite(at, end);
    }

    // Where it ended: the file may be shorter.
    std::uint64_t ReadAndWrite(std::uint64_t at, std::uint64_t end) {
        while (at < end) {
            Ask();
            buffer_.resize(kBufferSize);
            const ssize_t got =
                ::pread(from_.fd(), buffer_.data(),
                        static_cast<std::size_t>(std::min<std::uint64_t>(end - at, kBufferSize)),
                        static_cast<off_t>(at));
            if (got < 0 && errno == EINTR) continue;
            if (got < 0) throw SystemFailure(from_.path(), errno);
            if (got == 0) break;
            to_.Write(at, ByteView(buffer_.data(), static_cast<std::size_t>(got)));
            at += static_cast<std::uint64_t>(got);
            watch_.on_bytes(static_cast<std::uint64_t>(got));
        }
        return at;
    }

    // Holes have been made by nobody's writing, and need not be looked at.
    void Compare() {
        const std::uint64_t size = to_.Size();
        for (std::uint64_t at = Seek(0, SEEK_DATA, size); at < size;
             at = Seek(at, SEEK_DATA, size)) {
            Ask();
            const Bytes wanted = from_.Read(at, kBufferSize);
            if (wanted == to_.Read(at, kBufferSize)) {
                at += std::max<std::uint64_t>(wanted.size(), 1);
                continue;
            }
            throw Changed();
        }
    }

    Failure Changed() const {
        return {kFailed, from_.path(), "it changed while it was copied", "copy it again"};
    }

    void Ask() const {
        if (!watch_.give_up()) return;
        throw Failure(kFailed, from_.path(), "interrupted", "copy it again");
    }

    const File& from_;
    const File& to_;
    const DataWatch& watch_;
    bool in_kernel_ = true;
    Bytes buffer_;
};

}  // namespace

void CopyData(const File& from, const File& to, const DataWatch& watch) {
    DataCopy(from, to, watch).Run();
}

void CopyStream(const File& from, const File& to, const DataWatch& watch) {
    constexpr int kWait = 100;  // milliseconds
    Bytes buffer(kBufferSize);
    std::uint64_t at = 0;
    for (;;) {
        if (watch.give_up()) throw Failure(kFailed, from.path(), "interrupted", "copy it again");
        pollfd readable = {from.fd(), POLLIN, 0};
        const int ready = ::poll(&readable, 1, kWait);
        if (ready == 0 || (ready < 0 && errno == EINTR)) continue;
        const ssize_t got = ::read(from.fd(), buffer.data(), buffer.size());
        if (got < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (got < 0) throw SystemFailure(from.path(), errno);
        if (got == 0) return;
        to.Write(at, ByteView(buffer.data(), static_cast<std::size_t>(got)));
        at += static_cast<std::uint64_t>(got);
        watch.on_bytes(static_cast<std::uint64_t>(got));
    }
}

}  // namespace mavoea::tool

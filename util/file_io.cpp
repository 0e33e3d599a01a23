#include "util/file_io.h"

#include <errno.h>

#include <algorithm>

namespace mavoea {

std::int64_t ReadAt(int fd, ByteSpan to, std::uint64_t offset) {
    std::size_t done = 0;
    while (done < to.size()) {
        const ssize_t got = kernel::Pread(fd, to.data() + done, to.size() - done,
                                          static_cast<off_t>(offset + done));
        if (got == 0) break;
        if (got < 0) {
            if (errno == EINTR) continue;
            return -1;
        }
        done += static_cast<std::size_t>(got);
    }
    return static_cast<std::int64_t>(done);
}

bool ReadParts(int fd, iovec* parts, int count, std::uint64_t offset) {
    for (;;) {
        while (count > 0 && parts->iov_len == 0) {
            ++parts;
            --count;
        }
        if (count == 0) return true;
        const ssize_t got = kernel::Preadv(fd, parts, count, static_cast<off_t>(offset));
        if (got < 0 && errno == EINTR) continue;
        if (got == 0) errno = EIO;
        if (got <= 0) return false;
        offset += static_cast<std::uint64_t>(got);
        auto left = static_cast<std::size_t>(got);
        for (int i = 0; left > 0; ++i) {
            const std::size_t used = std::min(left, parts[i].iov_len);
            parts[i].iov_base = static_cast<std::uint8_t*>(parts[i].iov_base) + used;
            parts[i].iov_len -= used;
            left -= used;
        }
    }
}

std::uint64_t WriteAt(int fd, ByteView from, std::uint64_t offset) {
    std::size_t done = 0;
    while (done < from.size()) {
        const ssize_t put = kernel::Pwrite(fd, from.data() + done, from.size() - done,
                                           static_cast<off_t>(offset + done));
        if (put < 0 && errno == EINTR) continue;
        if (put == 0) errno = EIO;
        if (put <= 0) break;
        done += static_cast<std::size_t>(put);
    }
    return done;
}

}  // namespace mavoea

// Moves the resource fork, which follows the attributes, when they grow or shrink.

#include <errno.h>
#include <string.h>

#include <algorithm>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "util/file_io.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_move_rfork");

constexpr std::uint32_t kStep = 16384;

}  // namespace

int EASMoveRFork(int fd, unsigned length, unsigned newStart, unsigned oldStart, int backwards) {
    std::uint8_t buffer[kStep];
    std::uint32_t left = length;
    while (left > 0) {
        const std::uint32_t step = std::min(left, kStep);
        const std::uint32_t at = backwards != 0 ? left - step : length - left;
        const std::int64_t got = ReadAt(fd, {buffer, step}, std::uint64_t{oldStart} + at);
        if (got < 0) {
            const int error = errno;
            unit.Log("%s:%d(%s) failed to read, cRead=%d, cToRead=%d, reason=%s.\n", "EASMoveRFork",
                     static_cast<int>(got), static_cast<int>(step), strerror(error));
            errno = error;
            return error == EIO ? -13 : -5;
        }
        if (got == 0) return 0;
        const auto count = static_cast<std::size_t>(got);
        if (WriteAt(fd, {buffer, count}, std::uint64_t{newStart} + at) != count) {
            const int error = errno;
            unit.Log("%s:%d(%s) failed to write, reason=%s.\n", "EASMoveRFork", strerror(error));
            errno = error;
            return error == EIO ? -13 : error == ENOSPC ? -9 : -5;
        }
        left -= step;
    }
    return 0;
}

int EASShiftRFork(EASHandle* h, unsigned newStart, unsigned oldStart, unsigned length) {
    if (h == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    if (length == 0 || newStart == oldStart) return 0;
    const bool up = newStart > oldStart;
    if (up && kernel::Ftruncate(h->fd, static_cast<off_t>(std::uint64_t{newStart} + length)) != 0) {
        return -1;
    }
    return EASMoveRFork(h->fd, length, newStart, oldStart, up ? 1 : 0) == 0 ? 0 : -1;
}

}  // namespace mavoea

// Writes Finder info into an object's resource file.

#include <errno.h>
#include <string.h>

#include <algorithm>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "path/ea_open.h"
#include "util/file_io.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_eadirfs_finfo_write");

// Where data may begin. A header that declares more descriptors than it has keeps its Finder info
// at kFinderInfoOffset, as streams do.
off_t FirstDataOffset(const AppleDoubleHeader& file) {
    return static_cast<off_t>(
        std::min<std::size_t>(DescriptorsEnd(file.entry_count), kFinderInfoOffset));
}

// A resource file that was just made: header, both descriptors and Finder info, no attribute area.
int WriteNewFile(const EASHandle& h) {
    if (h.fd < 0) return unit.Fail(Err::kBadArgument);
    const ByteView head(h.header, kAttributeHeaderOffset);
    return WriteAt(h.fd, head, 0) == head.size() ? 0 : unit.Fail(Err::kWrite);
}

int WriteFinderInfo(EASHandle* h, const unsigned char finfo[kFinderInfoSize]) {
    StreamHeader header = DecodeStreamHeader(h->header);
    memcpy(header.finder_info_bytes.data(), finfo, kFinderInfoSize);
    EncodeStreamHeader(header, h->header);
    const off_t size = kernel::Lseek(h->fd, 0, SEEK_END);
    if (size < 0) return unit.Fail(Err::kBadArgument);
    return size == 0 ? WriteNewFile(*h) : EASWriteFinderInfo(h);
}

// Takes away a resource file that this call has made and that holds nothing, so that a failed call
// leaves none behind. Its lock is had, or taken for that: another process that has it may be about
// to write, and one that waits for it looks afterwards whether the file is still there.
void RemoveIfEmpty(int fd, const char* file) {
    const ErrnoKeeper keep;
    const struct flock64 lock = {
        .l_type = F_WRLCK, .l_whence = SEEK_SET, .l_start = 0, .l_len = 0, .l_pid = 0};
    if (kernel::SetLock(fd, &lock) == 0 && kernel::Lseek(fd, 0, SEEK_END) == 0 && Names(file, fd)) {
        (void)kernel::Unlink(file);
    }
}

enum class Outcome { kWritten, kFailed, kReplaced };

// Once: kReplaced when another file, or none, had taken the place of the one that was opened.
Outcome Write(const char* path, const char* file, const unsigned char finfo[kFinderInfoSize]) {
    bool made = false;
    const UniqueFd fd(OpenOrMakeMetadata(path, MAVOEA_KIND_RESOURCE, &made));
    if (!fd) return Outcome::kFailed;
    EASHandle* const h = MAVOEASOpen(fd.get(), F_WRLCK);
    Outcome outcome = Outcome::kFailed;
    if (h != nullptr && !Names(file, fd.get())) {
        outcome = Outcome::kReplaced;
    } else if (h != nullptr && WriteFinderInfo(h, finfo) == 0) {
        outcome = Outcome::kWritten;
    }
    if (outcome == Outcome::kFailed && made) RemoveIfEmpty(fd.get(), file);
    const ErrnoKeeper keep;
    if (h != nullptr) (void)MAVOEASClose(h);
    return outcome;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAEADirFSFInfoWrite(const char* path, const unsigned char finfo[32]) {
    if (path == nullptr || finfo == nullptr) return unit.Fail(Err::kBadArgument);
    char file[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, path, MAVOEA_KIND_RESOURCE, file, MAVOEA_PATH_SIZE,
                   EA_PLACE_EADIR) != 0) {
        return -1;
    }
    for (int tries = kOpenTries; tries > 0; --tries) {
        const Outcome outcome = Write(path, file, finfo);
        if (outcome != Outcome::kReplaced) return outcome == Outcome::kWritten ? 0 : -1;
    }
    errno = EAGAIN;
    return unit.Fail(Err::kLock);
}

int EASWriteFinderInfo(EASHandle* h) {
    if (h == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    if (h->lockType != F_WRLCK) return unit.Fail(Err::kNotPermitted);
    const StreamHeader header = DecodeStreamHeader(h->header);
    const off_t offset = header.finder_info.data.offset;
    // A file without Finder info says 0, which is where its header is.
    if (offset < FirstDataOffset(header.file)) return unit.Fail(Err::kBadArgument);
    if (kernel::Lseek(h->fd, offset, SEEK_SET) < 0) {
        unit.Log("%s:%d Error: lseek error (%s)", strerror(errno));
        return unit.Fail(Err::kBadArgument);
    }
    const std::uint64_t written =
        WriteAt(h->fd, header.finder_info_bytes, static_cast<std::uint64_t>(offset));
    return written == kFinderInfoSize ? 0 : unit.Fail(Err::kWrite);
}

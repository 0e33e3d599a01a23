// Writes Finder info into an object's resource file.

#include <errno.h>
#include <string.h>

#include <algorithm>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "util/file_io.h"
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

// Takes away a resource file that holds nothing, so that a failed call leaves none behind.
void RemoveIfEmpty(int fd, const char* path) {
    const ErrnoKeeper keep;
    if (kernel::Lseek(fd, 0, SEEK_END) != 0) return;
    char file[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, path, MAVOEA_KIND_RESOURCE, file, kDerivedPathMax,
                   EA_PLACE_EADIR) == 0) {
        (void)kernel::Unlink(file);
    }
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAEADirFSFInfoWrite(const char* path, const unsigned char finfo[32]) {
    if (path == nullptr || finfo == nullptr) return unit.Fail(Err::kBadArgument);
    const UniqueFd fd(
        MAVOEAOpen(EA_FORM_FILE, path, MAVOEA_KIND_RESOURCE, O_RDWR | O_CREAT, EA_PLACE_EADIR));
    if (!fd) return -1;
    EASHandle* const h = MAVOEASOpen(fd.get(), F_WRLCK);
    const bool written = h != nullptr && WriteFinderInfo(h, finfo) == 0;
    if (h != nullptr) (void)MAVOEASClose(h);
    if (!written) RemoveIfEmpty(fd.get(), path);
    return written ? 0 : -1;
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

// Finder info on file-EA volumes: from an object's resource file into a fresh netatalk record.

#include <errno.h>
#include <string.h>

#include "adouble/internal.h"
#include "format/ea_stream.h"
#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"
#include "util/volume_kind.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_fileeafs_finfo_ea_sync");

// The Finder info of the resource file; zeros when there is no such file.
bool ReadResourceFile(const char* path, unsigned char finfo[kFinderInfoSize]) {
    errno = 0;  // A path that cannot be derived need not set it.
    const UniqueFd fd(
        MAVOEAOpen(EA_FORM_FILE, path, MAVOEA_KIND_RESOURCE, O_RDONLY, EA_PLACE_EADIR));
    if (!fd) return errno == ENOENT;
    EASHandle* const h = MAVOEASOpen(fd.get(), F_RDLCK);
    if (h == nullptr) return false;
    const StreamHeader header = DecodeStreamHeader(h->header);
    // Without such an entry the bytes are those at the start of the file.
    if (header.finder_info.id == EntryId::kFinderInfo) {
        memcpy(finfo, header.finder_info_bytes.data(), kFinderInfoSize);
    }
    (void)MAVOEASClose(h);
    return true;
}

}  // namespace

int EAFileEAFSFinfoFlush(const char* path, const unsigned char finfo[32]) {
    if (finfo == nullptr || path == nullptr) return unit.Fail(Err::kBadArgument);
    const auto block =
        EncodeFreshRecord(std::span<const std::uint8_t, kFinderInfoSize>(finfo, kFinderInfoSize));
    return MAVOEAFileEAAdoubleFlush(block.data(), static_cast<int>(block.size()), path);
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEAFileEAFSFinfoEASync(const char* path, int checkFSType) {
    if (checkFSType == 1 && !OnFileEAVolume(path)) return 0;
    if (path == nullptr) return unit.Fail(Err::kBadArgument);
    unsigned char finfo[kFinderInfoSize] = {};
    if (!ReadResourceFile(path, finfo)) return -1;
    const int flushed = EAFileEAFSFinfoFlush(path, finfo);
    const int stamped = MAVOEAFileEAWriteFlushTime(path, 0);
    return flushed == 0 && stamped == 0 ? 0 : -1;
}

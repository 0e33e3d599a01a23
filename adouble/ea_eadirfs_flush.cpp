// Writes a netatalk record over the head of its object's resource file.

#include <errno.h>
#include <string.h>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "util/file_io.h"
#include "util/metadata_file.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_eadirfs_flush");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAEADirAdoubleFlush(const void* buf, int len, const char* path) {
    if (buf == nullptr || len < 0 || path == nullptr) return unit.Fail(Err::kBadArgument);
    const auto size = static_cast<std::size_t>(len);
    if (size > kRecordDataSize) return unit.Fail(Err::kBadArgument);

    char file[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, path, MAVOEA_KIND_RESOURCE, file, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0) {
        unit.Log("%s:%d Fail to generate path of %s.", path);
        return -1;
    }
    // The descriptor stays open on every way out: closing it would drop the process's record locks
    // on the file, which a caller may hold through a stream handle.
    bool made = false;
    const int fd = OpenOrMake(file, &made);
    if (fd < 0) {
        unit.Log("%s:%d Error open path [%s] %s", path, strerror(errno));
        return unit.Fail(Err::kOpen);
    }
    if (WriteAt(fd, {static_cast<const std::uint8_t*>(buf), size}, 0) != size) {
        unit.Log("%s:%d Error: write path [%s] %s", path, strerror(errno));
        const ErrnoKeeper keep;
        if (made && Names(file, fd)) (void)kernel::Unlink(file);
        return unit.Fail(Err::kWrite);
    }
    return 0;
}

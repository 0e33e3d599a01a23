// The netatalk record of an object on an EA-directory volume: the head of its resource file.

#include <errno.h>
#include <string.h>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "util/file_io.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_eadirfs_adouble_read");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAEADirAdoubleRead(const char* path, EAAdouble* ad) {
    if (path == nullptr || ad == nullptr) return unit.Fail(Err::kBadArgument);

    char file[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, path, MAVOEA_KIND_RESOURCE, file, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0) {
        unit.Log("%s:%d Fail to generate path of %s.", path);
        return -1;
    }
    unsigned long long file_size = 0;
    const UniqueFd fd(kernel::OpenToRead(file, &file_size));
    if (!fd) {
        if (errno == ENOENT) return 1;
        unit.Log("%s:%d Error: open path [%s] %s", path, strerror(errno));
        return unit.Fail(Err::kOpen);
    }
    if (file_size < kResourceHeadSize) return 1;  // A resource file in another layout.
    std::uint8_t block[kResourceHeadSize];
    const std::int64_t size = ReadAt(fd.get(), block, 0);
    if (size < 0) {
        unit.Log("%s:%d Error: read path [%s] %s", path, strerror(errno));
        return unit.Fail(Err::kRead);
    }
    if (size < std::int64_t{kResourceHeadSize}) return 1;  // It has been cut meanwhile.
    if (MAVOEAAdoubleRead(block, kResourceHeadSize, ad) != 0) {
        unit.Log("%s:%d EAAdoubleRead failed");
        return -1;
    }
    return 0;
}

// The netatalk record of an object on a file-EA volume: an extended attribute of its own.

#include <errno.h>
#include <string.h>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "util/bytes.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_fileafs_adouble_read");  // sic: logs are searched for it

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAFileEAAdoubleRead(const char* path, EAAdouble* ad) {
    if (path == nullptr || ad == nullptr) return unit.Fail(Err::kBadArgument);

    std::uint8_t block[kAttributeBlockSize] = {};
    const ssize_t size = kernel::Getxattr(path, kNetatalkAttribute, block, sizeof block);
    if (size < 0) {
        if (errno == ENODATA || errno == ENOENT) return 1;
        unit.Log("%s:%d Error: getxattr path [%s] %s", path, strerror(errno));
        return unit.Fail(Err::kRead);
    }
    if (size != kAttributeBlockSize) {
        unit.Log("%s:%d Read size(%i) != AD_DATASZZ_EA(%i)", static_cast<int>(size),
                 static_cast<int>(kAttributeBlockSize));
        return unit.Fail(Err::kRead);
    }
    if (MAVOEAAdoubleRead(block, kAttributeBlockSize, ad) != 0) {
        unit.Log("%s:%d MAVOEAAdoubleRead failed");
        return unit.Fail(Err::kRead);
    }

    BeReader in(block);
    const unsigned count = DecodeAppleDoubleHeader(in).entry_count;
    bool complete = count == kFreshRecord.size();
    for (const RecordEntry& entry : kFreshRecord) {
        complete = complete && ad->entries[static_cast<std::size_t>(entry.slot)].offset != 0;
    }
    if (!complete) {
        unit.Log("%s:%d Entry size[%u] != ADEID_NUM_EA[%u] or ad_entry error", count,
                 static_cast<unsigned>(kFreshRecord.size()));
        return unit.Fail(Err::kRead);
    }
    return 0;
}

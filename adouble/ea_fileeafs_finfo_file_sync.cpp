// Finder info on file-EA volumes: from the object's netatalk record into its resource file.

#include <string.h>

#include "adouble/internal.h"
#include "include/mavoea.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_fileeafs_finfo_file_sync");

}  // namespace

int EAFileEAFSFinfoRead(const char* path, unsigned char finfo[32]) {
    if (path == nullptr || finfo == nullptr) return unit.Fail(Err::kBadArgument);
    EAAdouble record = {};
    const int found = MAVOEAFileEAAdoubleRead(path, &record);
    if (found != 0) return found;
    const auto bytes = EntryBytes(record, Slot::kFinderInfo, kFinderInfoSize);
    if (!bytes.empty()) memcpy(finfo, bytes.data(), bytes.size());
    return 0;
}

int EAFileEAFSFinfoFileSync(const char* path) {
    unsigned char finfo[kFinderInfoSize] = {};
    const int found = EAFileEAFSFinfoRead(path, finfo);
    if (found != 0) return found < 0 ? -1 : 0;
    return MAVOEAEADirFSFInfoWrite(path, finfo);
}

}  // namespace mavoea

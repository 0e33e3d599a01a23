// Finder info on file-EA volumes: from the object's netatalk record into its resource file.

#include <string.h>

#include "adouble/internal.h"
#include "include/mavoea.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_fileeafs_finfo_file_sync");

// EAFileEAFSFinfoRead() behind its arguments. *found tells whether the record has Finder info.
int ReadRecord(const char* path, unsigned char finfo[kFinderInfoSize], bool* found) {
    EAAdouble record = {};
    const int result = MAVOEAFileEAAdoubleRead(path, &record);
    if (result != 0) return result;
    const auto bytes = EntryBytes(record, Slot::kFinderInfo, kFinderInfoSize);
    *found = !bytes.empty();
    if (*found) memcpy(finfo, bytes.data(), bytes.size());
    return 0;
}

}  // namespace

int EAFileEAFSFinfoRead(const char* path, unsigned char finfo[32]) {
    if (path == nullptr || finfo == nullptr) return unit.Fail(Err::kBadArgument);
    bool found = false;
    return ReadRecord(path, finfo, &found);
}

int EAFileEAFSFinfoFileSync(const char* path) {
    if (path == nullptr) return unit.Fail(Err::kBadArgument);
    unsigned char finfo[kFinderInfoSize];
    bool found = false;
    if (ReadRecord(path, finfo, &found) < 0) return -1;
    return found ? MAVOEAEADirFSFInfoWrite(path, finfo) : 0;
}

}  // namespace mavoea

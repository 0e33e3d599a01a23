#include "tools/transfer/indexes.h"

#include <sys/stat.h>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tools/place/dry_run.h"

namespace mavoea::tool {

void ReportNew(const std::string& path, mode_t mode) {
    if (DryRun()) return;
    constexpr int kAdded = 1;
    constexpr int kDirectoryAdded = 3;
    (void)MAVOIndex(path.c_str(), nullptr, S_ISDIR(mode) ? kDirectoryAdded : kAdded);
    (void)MLIBMavoFileIndexAdd(path.c_str(), nullptr, kAdded);
}

void ReportRenamed(const std::string& from, const std::string& to) {
    if (DryRun()) return;
    constexpr int kRenamed = 4;
    (void)MAVOIndex(to.c_str(), from.c_str(), kRenamed);
    (void)MLIBMavoFileIndexAdd(to.c_str(), from.c_str(), kRenamed);
}

void ReportRemoved(const std::string& path) {
    if (DryRun()) return;
    constexpr int kSearchRemoved = 7;
    constexpr int kFileRemoved = 6;
    (void)MAVOIndex(path.c_str(), nullptr, kSearchRemoved);
    (void)MLIBMavoFileIndexAdd(path.c_str(), nullptr, kFileRemoved);
}

}  // namespace mavoea::tool

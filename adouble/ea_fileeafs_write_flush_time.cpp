// Stamps an object on a file-EA volume with the time at which its metadata changed.

#include "adouble/internal.h"
#include "format/flush_time.h"
#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_fileeafs_write_flush_time");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAFileEAWriteFlushTime(const char* path, int checkFSType) {
    if (path == nullptr) return unit.Fail(Err::kBadArgument);
    if (checkFSType == 1 && !OnFileEAVolume(path)) return 0;
    const auto stamp = EncodeFlushTime(kernel::Time());
    if (kernel::Setxattr(path, kFlushTimeAttribute, stamp.data(), stamp.size(), 0) != 0) {
        return unit.Fail(Err::kSystemCall);
    }
    return 0;
}

// Stores a netatalk record as an extended attribute of its object.

#include <errno.h>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_fileeafs_flush");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAFileEAAdoubleFlush(const void* buf, int len, const char* path) {
    if (buf == nullptr || len < 0 || path == nullptr) return unit.Fail(Err::kBadArgument);
    const auto size = static_cast<std::size_t>(len);
    if (size > kRecordDataSize) return unit.Fail(Err::kBadArgument);
    if (kernel::Setxattr(path, kNetatalkAttribute, buf, size, 0) == 0) return 0;
    return unit.Fail(errno == EPERM ? Err::kNotPermitted : Err::kWrite);
}

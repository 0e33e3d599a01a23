// Makes a stream durable.

#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("eas_flush");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEASFlush(EASHandle* h) {
    if (h == nullptr || h->fd < 0) return unit.Fail(Err::kBadArgument);
    // Never tried again: after a failure the kernel may have dropped what it could not write, and
    // a second fsync would report success.
    return kernel::Fsync(h->fd) != 0 ? unit.Fail(Err::kSystemCall) : 0;
}

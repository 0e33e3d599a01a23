// The frame that the resource-fork operations share.

#include "xattr/resource_fork.h"

#include <errno.h>

#include "util/path_text.h"

namespace mavoea {
namespace {

constexpr mode_t kPermissions = 07777;

}  // namespace

ForkAccess::ForkAccess(const Unit& unit, const ForkLines& lines, const char* object, mode_t mode)
    : unit_(unit),
      lines_(lines),
      object_(object),
      mode_(mode & kPermissions),
      opened_up_((mode & S_IXUSR) == 0) {
    constexpr std::string_view kView = "/rsrc";
    const std::string_view name(object);
    fits_ = name.size() + kView.size() < sizeof path_;
    CutShort(path_, sizeof path_).Add(name).Add(kView);

    if (!opened_up_) return;
    former_uid_ = kernel::Geteuid();
    if (former_uid_ != 0 && kernel::Seteuid(0) != 0) {
        unit_.LogAt(lines_.in, "%s:%d Fail to seteuid(0). %m");
    }
    if (kernel::Chmod(object_, mode_ | S_IXUSR) != 0) {
        unit_.LogAt(lines_.in, "%s:%d Fail to chmod. %m");
    }
}

ForkAccess::~ForkAccess() {
    if (!opened_up_) return;
    const ErrnoKeeper keep;
    if (kernel::Chmod(object_, mode_) != 0) unit_.LogAt(lines_.back, "%s:%d Fail to chmod. %m");
    if (kernel::Geteuid() != former_uid_ && kernel::Seteuid(former_uid_) != 0) {
        unit_.LogAt(lines_.back, "%s:%d Fail to seteuid() back. %m");
    }
}

int ForkAccess::Stat(struct stat* info) const {
    if (!fits_) {
        errno = ENAMETOOLONG;
        return -1;
    }
    return kernel::Stat(path_, info);
}

}  // namespace mavoea

#include "tests/platform/support/private_mounts.h"

#include <sched.h>
#include <stdlib.h>
#include <sys/mount.h>
#include <unistd.h>

#include <utility>

namespace mavoea::test {

PrivateMount::PrivateMount(std::string directory, const char* type, const char* options)
    : directory_(std::move(directory)) {
    static const bool alone =
        unshare(CLONE_NEWNS) == 0 && mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
    ok_ = alone && mount("none", directory_.c_str(), type, 0, options) == 0;
}

PrivateMount::~PrivateMount() {
    if (ok_) umount2(directory_.c_str(), MNT_DETACH);
}

AsNobody::AsNobody() : user_(geteuid()), ok_(user_ == 0 && seteuid(65534) == 0) {}

AsNobody::~AsNobody() {
    if (ok_ && seteuid(user_) != 0) abort();
}

}  // namespace mavoea::test

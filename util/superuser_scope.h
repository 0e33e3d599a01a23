// Runs a scope as the superuser: effective uid 0 until its end.
#ifndef MAVOEA_UTIL_SUPERUSER_SCOPE_H_
#define MAVOEA_UTIL_SUPERUSER_SCOPE_H_

#include "platform/kernel.h"
#include "util/unit.h"

namespace mavoea {

// The effective uid belongs to the process: other threads run under it too meanwhile.
class SuperuserScope {
 public:
    SuperuserScope() : former_(kernel::Geteuid()), ok_(former_ == 0 || kernel::Seteuid(0) == 0) {}
    ~SuperuserScope() {
        const ErrnoKeeper keep;
        if (former_ != 0 && kernel::Geteuid() != former_) (void)kernel::Seteuid(former_);
    }
    SuperuserScope(const SuperuserScope&) = delete;
    SuperuserScope& operator=(const SuperuserScope&) = delete;

    bool ok() const { return ok_; }

 private:
    uid_t former_;
    bool ok_;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_SUPERUSER_SCOPE_H_

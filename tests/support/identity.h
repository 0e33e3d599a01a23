// An effective uid of the test's own in front of the process's, for fixtures.
#ifndef MAVOEA_TESTS_SUPPORT_IDENTITY_H_
#define MAVOEA_TESTS_SUPPORT_IDENTITY_H_

#include <sys/types.h>

#include "tests/support/kernel_control.h"

namespace mavoea::test {

class Identity {
 protected:
    // From here on geteuid() and seteuid() deal with uid_, and every seteuid() succeeds.
    void BeUser(uid_t uid) {
        uid_ = uid;
        Hooks().geteuid = [this] { return uid_; };
        Hooks().seteuid = [this](uid_t to) {
            uid_ = to;
            return 0;
        };
    }

    // The process's own identity again.
    static void BeWhoWeAre() {
        Hooks().geteuid = nullptr;
        Hooks().seteuid = nullptr;
    }

    uid_t uid_ = 0;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_IDENTITY_H_

// Filesystems that a test mounts where no other process sees them; and another user's eyes.
#ifndef MAVOEA_TESTS_PLATFORM_SUPPORT_PRIVATE_MOUNTS_H_
#define MAVOEA_TESTS_PLATFORM_SUPPORT_PRIVATE_MOUNTS_H_

#include <sys/types.h>

#include <string>

namespace mavoea::test {

// A filesystem on `directory` while the object lives. ok() is false when this process may not
// mount, or the kernel does not have the filesystem.
class PrivateMount {
 public:
    PrivateMount(std::string directory, const char* type, const char* options = "");
    ~PrivateMount();
    PrivateMount(const PrivateMount&) = delete;
    PrivateMount& operator=(const PrivateMount&) = delete;

    bool ok() const { return ok_; }

 private:
    std::string directory_;
    bool ok_ = false;
};

// Makes this process's effective user one without rights. ok() is false when it may not.
class AsNobody {
 public:
    AsNobody();
    ~AsNobody();
    AsNobody(const AsNobody&) = delete;
    AsNobody& operator=(const AsNobody&) = delete;

    bool ok() const { return ok_; }

 private:
    uid_t user_;
    bool ok_ = false;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_PLATFORM_SUPPORT_PRIVATE_MOUNTS_H_

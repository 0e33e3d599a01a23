// A filesystem other than that of temporary files.
#ifndef MAVOEA_TESTS_SUPPORT_SECOND_VOLUME_H_
#define MAVOEA_TESTS_SUPPORT_SECOND_VOLUME_H_

#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <optional>
#include <string>

#include "tests/support/temp_dir.h"

namespace mavoea::test {

// A tmpfs that is mounted where no other process sees it, or else a directory in /dev/shm; emptied
// at the end of its scope. ok() is false when neither is to be had.
class SecondVolume {
 public:
    explicit SecondVolume(const char* options = "", bool must_be_mounted = false) {
        static const bool alone = unshare(CLONE_NEWNS) == 0 &&
                                  mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
        mounted_ = alone && mount("none", point_.path().c_str(), "tmpfs", 0, options) == 0;
        struct stat here;
        struct stat there;
        if (!mounted_ && !must_be_mounted && stat(point_.path().c_str(), &here) == 0 &&
            stat("/dev/shm", &there) == 0 && here.st_dev != there.st_dev) {
            elsewhere_.emplace("/dev/shm");
        }
    }
    ~SecondVolume() {
        if (mounted_) umount2(point_.path().c_str(), MNT_DETACH);
    }
    SecondVolume(const SecondVolume&) = delete;
    SecondVolume& operator=(const SecondVolume&) = delete;

    bool ok() const { return mounted_ || elsewhere_; }
    const std::string& path() const { return elsewhere_ ? elsewhere_->path() : point_.path(); }

 private:
    TempDir point_;
    std::optional<TempDir> elsewhere_;
    bool mounted_ = false;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_SECOND_VOLUME_H_

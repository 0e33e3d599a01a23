// A file system in which "a" and "A" are one name.
#ifndef MAVOEA_TESTS_TOOL_CASE_VOLUME_H_
#define MAVOEA_TESTS_TOOL_CASE_VOLUME_H_

#include <sys/types.h>

#include <string>

#include "tests/platform/support/private_mounts.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

// Whether files can have several names, as nearly everywhere.
enum class HardLinks { kAny, kNone };

// One, empty, mounted where no other process sees it. Names are kept and listed as they were given
// first, and looked up whatever the case of their letters. As on the kernel's own file systems of
// that kind, every spelling of a name leads to the same inode, and a rename from one to another
// succeeds and does nothing. ok() is false when this process may not mount, or FUSE is missing.
class CaseVolume {
 public:
    explicit CaseVolume(HardLinks hard_links = HardLinks::kAny);
    ~CaseVolume();
    CaseVolume(const CaseVolume&) = delete;
    CaseVolume& operator=(const CaseVolume&) = delete;

    bool ok() const { return server_ > 0; }
    const std::string& path() const { return path_; }

 private:
    const TempDir point_;
    const PrivateMount room_{point_.path(), "tmpfs"};
    const std::string path_ = point_ / "volume";
    pid_t server_ = -1;  // the process that is the file system
};

#define MAVOEA_SKIP_WITHOUT_CASE_VOLUME(volume)                    \
    if (!(volume).ok()) {                                          \
        GTEST_SKIP() << "needs the superuser, to mount, and FUSE"; \
    }

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_CASE_VOLUME_H_

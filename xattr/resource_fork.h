// The resource fork as a file: "<object>/rsrc", a view that the volume's filesystem offers beneath
// regular files.
#ifndef MAVOEA_XATTR_RESOURCE_FORK_H_
#define MAVOEA_XATTR_RESOURCE_FORK_H_

#include <string_view>
#include <utility>

#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {

// The one attribute name that the attribute calls never see.
inline constexpr std::string_view kResourceForkName = "com.apple.ResourceFork";

// Makes the view reachable for as long as it lives: a file without the owner-execute bit gets it,
// as the superuser, and both are put back at the end. What fails on the way is logged, in the name
// of `unit` and the line that made this object, and goes on: the operation fails by itself where
// access is denied.
class ForkAccess {
 public:
    ForkAccess(const Unit& unit, const char* object, mode_t mode, int line = __builtin_LINE());
    ~ForkAccess();
    ForkAccess(const ForkAccess&) = delete;
    ForkAccess& operator=(const ForkAccess&) = delete;

    const char* path() const { return path_; }

    // As stat(2); errno ENAMETOOLONG when the view's path is too long for any file.
    int Stat(struct stat* info) const;

 private:
    const Unit& unit_;
    const char* object_;
    mode_t mode_;
    int line_;
    bool opened_up_;
    bool fits_;
    uid_t former_uid_ = 0;
    char path_[4095];
};

// Closes a stream.
class UniqueFile {
 public:
    explicit UniqueFile(FILE* file) : file_(file) {}
    ~UniqueFile() {
        const ErrnoKeeper keep;
        (void)Close();
    }
    UniqueFile(const UniqueFile&) = delete;
    UniqueFile& operator=(const UniqueFile&) = delete;

    FILE* get() const { return file_; }
    explicit operator bool() const { return file_ != nullptr; }

    // False when what was written could not be handed to the kernel; errno has the cause.
    [[nodiscard]] bool Close() {
        FILE* const file = std::exchange(file_, nullptr);
        return file == nullptr || kernel::Fclose(file) == 0;
    }

 private:
    FILE* file_;
};

}  // namespace mavoea

#endif  // MAVOEA_XATTR_RESOURCE_FORK_H_

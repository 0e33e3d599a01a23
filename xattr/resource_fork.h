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

// The lines of a unit that tell in the log which way it was that failed.
struct ForkLines {
    int in;    // the mode is changed
    int back;  // and put back
};

// Makes the view reachable for as long as it lives: a file without the owner-execute bit gets it,
// as the superuser, and both are put back at the end. What fails on the way is logged, in the name
// of `unit` and its lines, and goes on: the operation fails by itself where access is denied.
class ForkAccess {
 public:
    ForkAccess(const Unit& unit, const ForkLines& lines, const char* object, mode_t mode);
    ~ForkAccess();
    ForkAccess(const ForkAccess&) = delete;
    ForkAccess& operator=(const ForkAccess&) = delete;

    const char* path() const { return path_; }

    // As stat(2); errno ENAMETOOLONG when the view's path is too long for any file.
    int Stat(struct stat* info) const;

 private:
    const Unit& unit_;
    ForkLines lines_;
    const char* object_;
    mode_t mode_;
    bool opened_up_;
    bool fits_;
    uid_t former_uid_ = 0;
    char path_[4095];
};

// Hands the fork of an object that is to be changed, and its size in bytes, to `change`, and
// returns what that returns. -1 when there is no fork to be reached: reported for `unit` and the
// line that called.
template <class Change>
int ChangeFork(const Unit& unit, const ForkLines& lines, const char* object, Change change,
               int line = __builtin_LINE()) {
    struct stat info;
    if (kernel::Stat(object, &info) != 0) {
        unit.LogAt(line, "%s:%d Fail to stat(%s). %m", object);
        return -1;
    }
    if (S_ISDIR(info.st_mode)) return unit.Fail(Err::kNothingThere, line);
    const ForkAccess fork(unit, lines, object, info.st_mode);
    if (fork.Stat(&info) != 0) {
        unit.LogAt(line, "%s:%d Fail to stat(%s). %m", fork.path());
        return -1;
    }
    return change(fork, info.st_size);
}

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

// The marks on a kernel that does not know the platform's calls: extended attributes of the file
// (attribute_word.h), which libmavocore's MLIBCFileStat() shows in the attribute word.

#include <errno.h>
#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <span>

#include "platform/attribute_word.h"
#include "platform/descriptors.h"
#include "platform/dos_attributes.h"
#include "platform/include/mavocore.h"
#include "platform/marks.h"

namespace mavoea::marks {
namespace {

struct Change {
    unsigned set = 0;
    unsigned clear = 0;
};

// Changes what DOS attributes say, where there are any that are understood, in place: they keep all
// else that is in them. `get` and `set` take an attribute's name first.
template <class Get, class Set>
int ChangeDosAttributes(Change change, Get get, Set set) {
    unsigned char bytes[kDosAttributesMax];
    const ssize_t size = get(kDosAttributesName, bytes, sizeof bytes);
    if (size < 0) return attribute_word::MeansNone(errno) ? 0 : -1;
    const std::span value(bytes, static_cast<std::size_t>(size));
    auto dos = DecodeDosAttributes(value);
    if (!dos) return 0;
    const std::uint32_t changed = (dos->attributes | attribute_word::ToDos(change.set)) &
                                  ~attribute_word::ToDos(change.clear);
    if (changed == dos->attributes) return 0;
    if (SetDosAttributes(value, changed)) {
        return set(kDosAttributesName, value.data(), value.size());
    }
    // A text, which Samba replaces as well.
    dos->attributes = changed;
    const auto encoded = EncodeDosAttributes(*dos);
    return set(kDosAttributesName, encoded.data(), encoded.size());
}

// Changes the word, and what of it is shared. A file without a word has none of the bits, and gets
// no word to say so.
template <class Get, class Set>
int ChangeWord(Change change, Get get, Set set) {
    unsigned char bytes[attribute_word::kSize];
    const ssize_t size = get(attribute_word::kName, bytes, sizeof bytes);
    if (size < 0 && !attribute_word::MeansNone(errno)) return -1;
    const bool shared = ((change.set | change.clear) & attribute_word::kSharedBits) != 0;
    if (shared && ChangeDosAttributes(change, get, set) != 0) return -1;
    const unsigned word = attribute_word::Decode(bytes, size);
    const unsigned changed = (word | change.set) & ~change.clear;
    if (changed == word) return 0;
    attribute_word::Encode(changed, bytes);
    return set(attribute_word::kName, bytes, sizeof bytes);
}

int ChangeWordAt(const char* path, Change change) {
    return ChangeWord(
        change,
        [path](const char* name, void* bytes, size_t size) {
            return ::getxattr(path, name, bytes, size);
        },
        [path](const char* name, const void* bytes, size_t size) {
            return ::setxattr(path, name, bytes, size, 0);
        });
}

bool FindChange(int command, Change* change) {
    switch (command) {
        case kSetHidden:
            *change = {.set = MLIBC_ATTRIBUTE_HIDDEN};
            return true;
        case kClearHidden:
            *change = {.clear = MLIBC_ATTRIBUTE_HIDDEN};
            return true;
        case kSetLocked:
            *change = {.set = MLIBC_ATTRIBUTE_LOCKED};
            return true;
        case kClearLocked:
            *change = {.clear = MLIBC_ATTRIBUTE_LOCKED};
            return true;
        default:
            return false;
    }
}

// What kernels answer that have no such call, or another one under its number.
bool MeansNoCall(int error) { return error == ENOSYS || error == EINVAL || error == EFAULT; }

// A kernel that does not know a call will not learn it, and is not asked again.
std::atomic<bool> sets_archive = true;
std::atomic<bool> takes_commands = true;

}  // namespace

int SetArchiveBit(int fd) {
    if (sets_archive.load(std::memory_order_relaxed)) {
        const int result = ::fcntl(fd, kSetArchive);
        if (result >= 0 || errno != EINVAL) return result;
        sets_archive.store(false, std::memory_order_relaxed);
    }
    return ChangeWord(
        {.set = MLIBC_ATTRIBUTE_ARCHIVE},
        [fd](const char* name, void* bytes, size_t size) {
            return ::fgetxattr(fd, name, bytes, size);
        },
        [fd](const char* name, const void* bytes, size_t size) {
            return ::fsetxattr(fd, name, bytes, size, 0);
        });
}

int SetArchiveBit(const char* path) {
    if (sets_archive.load(std::memory_order_relaxed)) {
        const int fd = OpenToMark(path);
        if (fd < 0) return -1;
        const int result = SetArchiveBit(fd);
        CloseQuietly(fd);
        return result;
    }
    return ChangeWordAt(path, {.set = MLIBC_ATTRIBUTE_ARCHIVE});
}

int FileCommand(const char* path, int command) {
    if (takes_commands.load(std::memory_order_relaxed)) {
        const long result = ::syscall(kFileCommandCall, path, command);
        if (result >= 0 || !MeansNoCall(errno)) return static_cast<int>(result);
        if (errno == ENOSYS) takes_commands.store(false, std::memory_order_relaxed);
    }
    Change change;
    if (!FindChange(command, &change)) {
        errno = EINVAL;
        return -1;
    }
    return ChangeWordAt(path, change);
}

}  // namespace mavoea::marks

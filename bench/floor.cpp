#include "bench/floor.h"

#include <fcntl.h>
#include <string.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>

namespace mavoea::bench::floor {
namespace {

constexpr std::size_t kNameMax = 242;
constexpr std::size_t kTableAt = 120;
constexpr std::size_t kRecordNameAt = 11;

// Takes most streams whole. Larger tables need a second read.
constexpr std::size_t kFirstRead = 4096;
constexpr std::size_t kLargestHead = std::size_t{1} << 20;

std::size_t ParentSize(const char* path, std::size_t size) {
    const auto* const slash = static_cast<const char*>(memrchr(path, '/', size));
    return slash == nullptr ? 0 : static_cast<std::size_t>(slash + 1 - path);
}

char* Put(char* to, const char* text, std::size_t size) {
    memcpy(to, text, size);
    return to + size;
}

char* PutShortened(char* to, const char* name, std::size_t size) {
    static constexpr char characters[] =
        "1234567890abcdefghijklmnopqrstuvwxyz-_=+';[]{}~`.!@#$%^&*() ";
    unsigned sum = 0;
    for (std::size_t i = kNameMax - 1; i < size; ++i) sum += static_cast<unsigned char>(name[i]);
    const auto* const dot = static_cast<const char*>(memrchr(name + size - 6, '.', 6));
    const std::size_t extension = dot == nullptr ? 0 : static_cast<std::size_t>(name + size - dot);
    to = Put(to, name, kNameMax - 1 - extension);
    *to++ = characters[sum % 60];
    return Put(to, name + size - extension, extension);
}

std::uint32_t U32(const std::uint8_t* at) {
    std::uint32_t value;
    memcpy(&value, at, sizeof value);
    return __builtin_bswap32(value);
}

unsigned U16(const std::uint8_t* at) { return static_cast<unsigned>(at[0] << 8 | at[1]); }

std::size_t RecordSize(const std::uint8_t* record) { return (record[10] + 14U) & ~3U; }

// Header and table of the stream on fd; nullptr on failure.
const std::uint8_t* ReadHead(int fd) {
    static std::uint8_t head[kLargestHead];
    const ssize_t got = pread(fd, head, kFirstRead, 0);
    if (got < ssize_t{kTableAt}) return nullptr;
    const std::size_t data_start = U32(head + 96);
    if (data_start <= static_cast<std::size_t>(got)) return head;
    if (data_start > kLargestHead) return nullptr;
    const std::size_t left = data_start - static_cast<std::size_t>(got);
    return pread(fd, head + got, left, got) == static_cast<ssize_t>(left) ? head : nullptr;
}

bool IsHiddenDirName(const char* name) {
    return strcasecmp(name, "@eaDir") == 0 || strcasecmp(name, "@tmp") == 0 ||
           strcasecmp(name, "@sharebin") == 0;
}

}  // namespace

void StreamPath(const char* path, const char* kind, char* to) {
    const std::size_t size = strlen(path);
    const std::size_t parent = ParentSize(path, size);
    to = Put(to, path, parent);
    to = Put(to, "@eaDir/", 7);
    to = size - parent > kNameMax ? PutShortened(to, path + parent, size - parent)
                                  : Put(to, path + parent, size - parent);
    *to++ = '@';
    Put(to, kind, strlen(kind) + 1);
}

void FormatStreamPath(const char* parent, const char* name, const char* kind, char* to) {
    snprintf(to, 4096, "%s/@eaDir/%s@%s", parent, name, kind);
}

void DirPath(const char* path, char* to) {
    to = Put(to, path, ParentSize(path, strlen(path)));
    Put(to, "@eaDir", 7);
}

void AppleDoublePath(const char* path, char* to) {
    const std::size_t size = strlen(path);
    const std::size_t parent = ParentSize(path, size);
    to = Put(to, path, parent);
    to = Put(to, "._", 2);
    Put(to, path + parent, size - parent + 1);
}

int CountHiddenDirNames(std::span<const char* const> names) {
    int count = 0;
    for (const char* name : names) count += *name == '@' && IsHiddenDirName(name) ? 1 : 0;
    return count;
}

int CountHiddenFiles(std::span<const char* const> names) {
    int count = 0;
    for (const char* name : names) {
        if (*name == '@') {
            count += IsHiddenDirName(name) ? 1 : 0;
        } else if (*name == '.') {
            count += name[1] == '_' || strcmp(name, ".") == 0 || strcmp(name, "..") == 0 ||
                             strcmp(name, ".DS_Store") == 0 || strncmp(name, ".MAVOGALDB", 10) == 0
                         ? 1
                         : 0;
        }
    }
    return count;
}

int CountNamesWithColon(std::span<const char* const> names) {
    int count = 0;
    for (const char* name : names) count += strchr(name, ':') != nullptr ? 1 : 0;
    return count;
}

int ReadValue(const char* path, std::string_view name, std::uint8_t* to, std::size_t size) {
    const int fd = open(path, O_RDONLY);
    const std::uint8_t* const head = fd < 0 ? nullptr : ReadHead(fd);
    if (head == nullptr) return -1;
    ssize_t got = -1;
    const std::uint8_t* record = head + kTableAt;
    for (unsigned left = U16(head + 118); left > 0; --left, record += RecordSize(record)) {
        if (record[10] != name.size() + 1 ||
            memcmp(record + kRecordNameAt, name.data(), name.size()) != 0) {
            continue;
        }
        got = pread(fd, to, std::min<std::size_t>(size, U32(record + 4)), U32(record));
        break;
    }
    close(fd);
    return static_cast<int>(got);
}

int ListNames(const char* path, MLIBCSzList** list) {
    const int fd = open(path, O_RDONLY);
    const std::uint8_t* const head = fd < 0 ? nullptr : ReadHead(fd);
    if (head == nullptr) return -1;
    const unsigned count = U16(head + 118);
    const std::uint8_t* record = head + kTableAt;
    for (unsigned i = 0; i < count; ++i, record += RecordSize(record)) {
        MLIBCSzListPush(list, reinterpret_cast<const char*>(record + kRecordNameAt));
    }
    close(fd);
    return static_cast<int>(count);
}

bool WriteDurably(int fd, std::span<const std::uint8_t> bytes, std::int64_t offset) {
    return pwrite(fd, bytes.data(), bytes.size(), offset) == static_cast<ssize_t>(bytes.size()) &&
           fsync(fd) == 0;
}

bool HasNoStream(const char* path) {
    char at[4096];
    StreamPath(path, "MavoEAStream", at);
    if (open(at, O_RDONLY) >= 0) return false;
    struct stat info;
    *strrchr(at, '@') = '\0';
    if (stat(at, &info) == 0) return false;
    AppleDoublePath(path, at);
    return stat(at, &info) != 0;
}

bool LockAndReplace(const char* path, std::span<const std::uint8_t> bytes) {
    const int fd = open(path, O_RDWR | O_CREAT, 0777);
    struct flock lock = {};
    lock.l_type = F_WRLCK;
    std::uint8_t old[kFirstRead];
    const bool done = fcntl(fd, F_SETLK, &lock) == 0 && pread(fd, old, sizeof old, 0) > 0 &&
                      WriteDurably(fd, bytes);
    close(fd);
    return done;
}

bool CloseUpAndWriteDurably(int fd, std::span<std::uint8_t> whole, std::size_t head_size,
                            std::size_t value_size) {
    const std::size_t moved = whole.size() - head_size - value_size;
    return pread(fd, whole.data() + head_size, moved, static_cast<off_t>(head_size + value_size)) ==
               static_cast<ssize_t>(moved) &&
           WriteDurably(fd, whole);
}

bool MoveUpAndWriteDurably(int fd, std::int64_t from, std::int64_t length, std::int64_t by,
                           std::span<const std::uint8_t> head) {
    if (ftruncate(fd, from + by + length) != 0) return false;
    char buffer[16384];
    for (std::int64_t left = length; left > 0;) {
        const auto step = std::min<std::int64_t>(left, sizeof buffer);
        left -= step;
        const auto size = static_cast<std::size_t>(step);
        if (pread(fd, buffer, size, from + left) != step ||
            pwrite(fd, buffer, size, from + by + left) != step) {
            return false;
        }
    }
    return WriteDurably(fd, head);
}

}  // namespace mavoea::bench::floor

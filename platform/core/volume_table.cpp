// The volume table: lookup, and the file under /etc.
//
// The file holds one "PATH TYPE" a line. TYPE is the last field, so PATH may hold blanks; blanks
// around either are dropped. Lines that are blank or begin with '#' say nothing. Of two lines with
// the same path the later one counts.

#include "platform/core/volume_table.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <syslog.h>
#include <unistd.h>

#include "platform/core/lexical_path.h"
#include "platform/include/mavocore.h"

namespace mavoea::core {
namespace {

constexpr int kPlatformTypeMax = 12;

struct NamedType {
    std::string_view name;
    int type;
};

constexpr NamedType kNamedTypes[] = {
    {"appledouble", 0},
    {"eadir", 1},
    {"fileea", 2},
    {"xattr", 7},
    {"samba", MAVO_VOLUME_SAMBA},
    {"samba-stream", MAVO_VOLUME_SAMBA_STREAM},
    {"netatalk", MAVO_VOLUME_NETATALK},
    {"netatalk-samba", MAVO_VOLUME_NETATALK_SAMBA},
    {"linux", MAVO_VOLUME_LINUX},
    {"samba-all-streams", MAVO_VOLUME_SAMBA_ALL_STREAMS},
};

constexpr bool IsPlatformType(int type) { return type >= 0 && type <= kPlatformTypeMax; }
constexpr bool IsType(int type) {
    return IsPlatformType(type) ||
           (type >= MAVO_VOLUME_SAMBA && type <= MAVO_VOLUME_SAMBA_ALL_STREAMS);
}

// The type that TYPE means, -1 for none.
constexpr int ParseType(std::string_view text) {
    for (const NamedType& known : kNamedTypes) {
        if (known.name == text) return known.type;
    }
    if (text.empty() || text.size() > 2) return -1;
    int number = 0;
    for (char c : text) {
        if (c < '0' || c > '9') return -1;
        number = 10 * number + (c - '0');
    }
    return IsPlatformType(number) ? number : -1;
}

static_assert(ParseType("0") == 0 && ParseType("12") == 12 && ParseType("eadir") == 1);
static_assert(ParseType("linux") == MAVO_VOLUME_LINUX && ParseType("104") == -1);
static_assert(ParseType("13") == -1 && ParseType("-1") == -1 && ParseType("") == -1);

constexpr std::string_view kBlanks = " \t\r\n\v\f";

constexpr std::string_view Trimmed(std::string_view text) {
    const std::size_t begin = text.find_first_not_of(kBlanks);
    if (begin == std::string_view::npos) return {};
    return {text.data() + begin, text.find_last_not_of(kBlanks) + 1 - begin};
}

struct Line {
    std::string_view path;  // empty: the line says nothing
    int type = -1;
    const char* complaint = nullptr;  // why the line is malformed
};

constexpr Line Malformed(const char* complaint) { return {{}, -1, complaint}; }

constexpr Line ParseLine(std::string_view raw) {
    const std::string_view text = Trimmed(raw);
    if (text.empty() || text.front() == '#') return {};
    if (text.find('\0') != std::string_view::npos) return Malformed("holds a NUL");
    if (!IsAbsolute(text)) return Malformed("does not begin with an absolute path");
    const std::size_t blank = text.find_last_of(kBlanks);
    if (blank == std::string_view::npos) return Malformed("has no type");
    const int type = ParseType({text.data() + blank + 1, text.size() - blank - 1});
    if (type < 0) return Malformed("does not end in a volume type");
    return {Trimmed({text.data(), blank}), type};
}

static_assert(ParseLine(" /my volume \t eadir\r\n").path == "/my volume");
static_assert(ParseLine("/ 0").path == "/" && ParseLine("/ 0").type == 0);

class MutexLock {
 public:
    explicit MutexLock(pthread_mutex_t* mutex) : mutex_(mutex) { pthread_mutex_lock(mutex_); }
    ~MutexLock() { pthread_mutex_unlock(mutex_); }
    MutexLock(const MutexLock&) = delete;
    MutexLock& operator=(const MutexLock&) = delete;

 private:
    pthread_mutex_t* const mutex_;
};

bool Same(const timespec& a, const timespec& b) {
    return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

// A regular file to read from, NULL with errno otherwise. Never waits for the other end of a FIFO.
FILE* OpenRegular(const char* path, struct stat* status) {
    const int fd = open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    if (fd < 0) return nullptr;
    FILE* file = nullptr;
    if (fstat(fd, status) == 0) {
        errno = S_ISDIR(status->st_mode) ? EISDIR : ENXIO;
        if (S_ISREG(status->st_mode)) file = fdopen(fd, "r");
    }
    if (file != nullptr) return file;
    const int error = errno;
    close(fd);
    errno = error;
    return nullptr;
}

// Reads every line into `volumes` and reports the malformed ones. What went wrong is the result.
VolumeTable::Fault ReadLines(FILE* file, const char* name, VolumeList* volumes) {
    VolumeTable::Fault fault;
    char* text = nullptr;
    std::size_t capacity = 0;
    for (int number = 1; fault.error == 0; ++number) {
        errno = 0;
        const ssize_t size = getline(&text, &capacity, file);
        if (size < 0) {
            fault.error = feof(file) != 0 ? 0 : errno;
            break;
        }
        const Line line = ParseLine({text, static_cast<std::size_t>(size)});
        if (line.complaint != nullptr) {
            syslog(LOG_WARNING, "%s:%d %s, line skipped", name, number, line.complaint);
            if (fault.line == 0) {
                fault.line = number;
                fault.problem = line.complaint;
            }
        } else if (!line.path.empty() && !volumes->Set(line.path, line.type, number)) {
            fault.error = ENOMEM;
        }
    }
    free(text);
    return fault;
}

constinit VolumeTable process_table(MAVO_VOLUME_TABLE);

}  // namespace

// ---- VolumeList ---------------------------------------------------------------------------------

bool VolumeList::Set(std::string_view path, int type, int line) {
    auto* const copy = static_cast<char*>(malloc(path.size()));
    if (copy == nullptr) return false;
    const std::size_t size = NormalizePath(path, copy);

    for (std::size_t i = 0; i < count_; ++i) {
        Volume& volume = volumes_[i];
        if (std::string_view(volume.path, volume.size) != std::string_view(copy, size)) continue;
        free(copy);
        volume.type = type;
        volume.line = line;
        return true;
    }

    if (count_ == capacity_) {
        const std::size_t capacity = capacity_ == 0 ? 8 : 2 * capacity_;
        void* const grown = reallocarray(volumes_, capacity, sizeof(Volume));
        if (grown == nullptr) {
            free(copy);
            return false;
        }
        volumes_ = static_cast<Volume*>(grown);
        capacity_ = capacity;
    }
    volumes_[count_++] = {copy, size, type, line};
    return true;
}

VolumeList::Match VolumeList::Find(std::string_view path) const {
    Match best;
    for (std::size_t i = 0; i < count_; ++i) {
        const Volume& volume = volumes_[i];
        if (best.type >= 0 && volume.size < best.size) continue;
        if (!IsInside(path, {volume.path, volume.size})) continue;
        best = {volume.size, volume.type, volume.line};
    }
    return best;
}

void VolumeList::Clear() {
    for (std::size_t i = 0; i < count_; ++i) free(volumes_[i].path);
    free(volumes_);
    *this = {};
}

// ---- VolumeTable --------------------------------------------------------------------------------

bool VolumeTable::Declare(std::string_view path, int type) {
    const MutexLock lock(&mutex_);
    return declared_.Set(path, type, 0);
}

bool VolumeTable::Find(std::string_view path, MAVOVolumeEntry* entry) {
    const int saved = errno;
    VolumeList::Match declared;
    VolumeList::Match listed;
    {
        const MutexLock lock(&mutex_);
        Refresh();
        declared = declared_.Find(path);
        listed = listed_.Find(path);
    }
    errno = saved;
    const bool file_knows_better =
        declared.type < 0 || (listed.type >= 0 && listed.size > declared.size);
    const VolumeList::Match& best = file_knows_better ? listed : declared;
    if (best.type < 0) return false;
    *entry = {.type = best.type,
              .source = file_knows_better ? MAVO_VOLUME_LISTED : MAVO_VOLUME_DECLARED,
              .line = best.line};
    return true;
}

int VolumeTable::Find(std::string_view path) {
    MAVOVolumeEntry entry;
    return Find(path, &entry) ? entry.type : -1;
}

VolumeTable::Fault VolumeTable::Check() {
    const int saved = errno;
    Fault fault;
    {
        const MutexLock lock(&mutex_);
        const int error = Refresh();
        fault = error == 0 ? fault_ : Fault{.error = error};
    }
    errno = saved;
    return fault;
}

void VolumeTable::Clear() {
    declared_.Clear();
    listed_.Clear();
    loaded_ = {};
    fault_ = {};
}

VolumeTable::Signature VolumeTable::SignatureOf(int result, const struct stat& status) {
    if (result != 0) return {.error = errno};
    return {.device = status.st_dev,
            .inode = status.st_ino,
            .size = status.st_size,
            .modified = status.st_mtim,
            .changed = status.st_ctim};
}

bool VolumeTable::Same(const Signature& a, const Signature& b) {
    return a.error == b.error && a.device == b.device && a.inode == b.inode && a.size == b.size &&
           core::Same(a.modified, b.modified) && core::Same(a.changed, b.changed);
}

int VolumeTable::Refresh() {
    struct stat status;
    const Signature now = SignatureOf(stat(file_, &status), status);
    return Same(now, loaded_) ? 0 : Load(now);
}

// Whatever goes wrong is reported once per state of the file; only for memory is it tried again.
int VolumeTable::Load(const Signature& seen) {
    struct stat status;
    VolumeList volumes;
    Signature loaded = seen;
    Fault fault;
    if (FILE* const file = OpenRegular(file_, &status)) {
        // Taken before the first byte is read: a change meanwhile makes it differ the next time.
        loaded = SignatureOf(0, status);
        fault = ReadLines(file, file_, &volumes);
        fclose(file);
    } else {
        fault.error = errno;
        if (fault.error == ENOENT || fault.error == ENOTDIR) fault.error = 0;  // it need not exist
    }

    if (fault.error == ENOMEM) {
        volumes.Clear();
        return ENOMEM;
    }
    if (fault.error != 0) {
        syslog(LOG_WARNING, "%s cannot be read: %s", file_, strerror(fault.error));
    }
    listed_.Clear();
    listed_ = volumes;
    loaded_ = loaded;
    fault_ = fault;
    return 0;
}

VolumeTable& ProcessVolumeTable() { return process_table; }

}  // namespace mavoea::core

using namespace mavoea::core;

int MAVOVolumeDeclare(const char* szPath, int type) {
    if (szPath == nullptr || !IsAbsolute(szPath) || !IsType(type)) {
        errno = EINVAL;
        return -1;
    }
    if (!process_table.Declare(szPath, type)) {
        errno = ENOMEM;
        return -1;
    }
    return 0;
}

int MAVOVolumeTypeFromName(const char* szName) {
    return szName == nullptr ? -1 : ParseType(szName);
}

int MAVOVolumeFind(const char* szPath, MAVOVolumeEntry* pEntry) {
    if (szPath == nullptr || !IsAbsolute(szPath) || pEntry == nullptr) {
        errno = EINVAL;
        return -1;
    }
    const LexicalPath lexical(szPath);
    if (!lexical.ok()) return -1;
    return process_table.Find(lexical.text(), pEntry) ? 1 : 0;
}

int MAVOVolumeTableCheck(int* pLine, const char** pszProblem) {
    if (pLine == nullptr || pszProblem == nullptr) {
        errno = EINVAL;
        return -1;
    }
    const VolumeTable::Fault fault = process_table.Check();
    if (fault.error != 0) {
        errno = fault.error;
        return -1;
    }
    if (fault.line == 0) return 0;
    *pLine = fault.line;
    *pszProblem = fault.problem;
    return 1;
}

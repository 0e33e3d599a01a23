// The volume table: directories that are known to be volumes of a type, declared by the process or
// listed in a file.
#ifndef MAVOEA_PLATFORM_CORE_VOLUME_TABLE_H_
#define MAVOEA_PLATFORM_CORE_VOLUME_TABLE_H_

#include <pthread.h>
#include <sys/stat.h>

#include <cstddef>
#include <string_view>

#include "platform/include/mavocore.h"

namespace mavoea::core {

// Volumes and their types. What it holds is freed with Clear() and not by a destructor, so that the
// process's table stays usable for threads that still run while the process exits.
class VolumeList {
 public:
    // Adds a volume, or changes its type and line. `path` is absolute. False when out of memory;
    // the list is unchanged then.
    bool Set(std::string_view path, int type, int line);

    // A volume that was found; `size` tells how long its path is. Without one, `type` is -1.
    struct Match {
        std::size_t size = 0;
        int type = -1;
        int line = 0;
    };

    // The volume with the longest path that `path`, normalized, is inside.
    Match Find(std::string_view path) const;

    void Clear();

 private:
    struct Volume {
        char* path;  // normalized, without a NUL
        std::size_t size;
        int type;
        int line;  // 0: of no file
    };

    Volume* volumes_ = nullptr;
    std::size_t count_ = 0;
    std::size_t capacity_ = 0;
};

// All of its functions may be called from several threads at once, Clear() excepted.
class VolumeTable {
 public:
    // `file` is the table file's path; it need not exist, and must outlive the table.
    explicit constexpr VolumeTable(const char* file) : file_(file) {}
    VolumeTable(const VolumeTable&) = delete;
    VolumeTable& operator=(const VolumeTable&) = delete;

    // Declares a volume for this process. False when out of memory.
    bool Declare(std::string_view path, int type);

    // Whether `path`, normalized, is inside a volume; *entry becomes that volume's, or stays as it
    // is. Loads the file when it has changed. errno stays as it is.
    bool Find(std::string_view path, MAVOVolumeEntry* entry);

    // Its type only; -1 for none.
    int Find(std::string_view path);

    // What is wrong with the file as it is now. Loads it when it has changed. errno stays as it is.
    struct Fault {
        int error = 0;                  // why it cannot be read; all else says nothing then
        int line = 0;                   // the first malformed one, from 1; 0: none is
        const char* problem = nullptr;  // static text
    };
    Fault Check();

    void Clear();

 private:
    // Which state of the file has been loaded.
    struct Signature {
        int error = 0;  // of stat(); all else is 0 then
        dev_t device = 0;
        ino_t inode = 0;
        off_t size = 0;
        timespec modified = {};
        timespec changed = {};
    };

    static Signature SignatureOf(int result, const struct stat& status);
    static bool Same(const Signature& a, const Signature& b);
    // 0, or ENOMEM: the table then holds what an earlier state of the file said.
    int Refresh();
    int Load(const Signature& seen);

    const char* const file_;
    pthread_mutex_t mutex_ = PTHREAD_MUTEX_INITIALIZER;
    VolumeList declared_ = {};
    VolumeList listed_ = {};
    Signature loaded_ = {};  // at first that of no file at all: an inode is never 0
    Fault fault_ = {};       // of the state that has been loaded
};

// The table that MAVOGetFSType() asks.
VolumeTable& ProcessVolumeTable();

}  // namespace mavoea::core

#endif  // MAVOEA_PLATFORM_CORE_VOLUME_TABLE_H_

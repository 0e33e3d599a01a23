// An open file whose failures are messages.
#ifndef MAVOEA_TOOLS_PLACE_FILE_H_
#define MAVOEA_TOOLS_PLACE_FILE_H_

#include <sys/stat.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "tools/say/text.h"

namespace mavoea::tool {

// Owns a descriptor. Closing it drops all record locks that the process holds on the file, so no
// file is open twice at a time. All members throw Failure, whose text names `path`.
class File {
 public:
    File(int fd, std::string path) : fd_(fd), path_(std::move(path)) {}
    ~File();
    File(File&& other) noexcept;
    File& operator=(File&&) = delete;

    // A regular file that somebody named, to be read; its access time stays where it may.
    static File OpenToRead(const std::string& path);

    // Whatever can be read, a FIFO too.
    static File OpenAny(const std::string& path);

    int fd() const { return fd_; }
    const std::string& path() const { return path_; }

    struct stat Status() const;
    std::uint64_t Size() const;

    // Up to `size` bytes at `offset`, fewer only where the file ends.
    Bytes Read(std::uint64_t offset, std::uint64_t size) const;

    // Reads all of it at once where that is no more than `most` bytes. From then on Size() and
    // Read() tell what it held, and ask nobody, until this writes to it. False when it has more.
    bool KeepContents(std::uint64_t most) const;
    bool keeps_contents() const { return contents_.has_value(); }

    void Write(std::uint64_t offset, ByteView bytes) const;
    // Where the descriptor stands, for what has no offsets.
    void Append(ByteView bytes) const;

    // Sees to it that the range can be written; a full disk then leaves the file as it was.
    void Reserve(std::uint64_t offset, std::uint64_t size) const;

    void Resize(std::uint64_t size) const;
    void Sync() const;

 private:
    std::size_t ReadAt(std::uint64_t offset, std::span<std::uint8_t> bytes,
                       std::size_t enough) const;

    int fd_;
    std::string path_;
    mutable std::optional<std::uint64_t> seen_size_;  // what it had at least, when last looked at
    mutable std::optional<Bytes> contents_;
};

// A descriptor for reading that leaves the access time alone where the process may have that:
// `flags` are openat()'s. Negative with errno.
int OpenQuietly(int directory, const char* name, int flags);

// Whether two of them are one file.
inline bool SameFile(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

inline bool IsBefore(const timespec& one, const timespec& other) {
    return one.tv_sec != other.tv_sec ? one.tv_sec < other.tv_sec : one.tv_nsec < other.tv_nsec;
}

// All that a descriptor has to give, such as standard input. Failure when it is more than `most`.
Bytes ReadToEnd(int fd, const std::string& name, std::uint64_t most);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_FILE_H_

// An open file whose failures are messages.
#ifndef MAVOEA_TOOLS_FILE_H_
#define MAVOEA_TOOLS_FILE_H_

#include <cstdint>
#include <string>

#include "tools/text.h"

namespace mavoea::tool {

// Owns a descriptor. Closing it drops all record locks that the process holds on the file, so no
// file is open twice at a time. All members throw Failure.
class File {
 public:
    File(int fd, std::string path) : fd_(fd), path_(std::move(path)) {}
    ~File();
    File(File&& other) noexcept;
    File& operator=(File&&) = delete;

    // A regular file, to be read.
    static File OpenToRead(const std::string& path);

    // Whatever can be read, a FIFO too.
    static File OpenAny(const std::string& path);

    int fd() const { return fd_; }
    const std::string& path() const { return path_; }

    std::uint64_t Size() const;

    // Up to `size` bytes at `offset`, fewer only where the file ends.
    Bytes Read(std::uint64_t offset, std::uint64_t size) const;

    void Write(std::uint64_t offset, ByteView bytes) const;

    // Sees to it that the range can be written; a full disk then leaves the file as it was.
    void Reserve(std::uint64_t offset, std::uint64_t size) const;

    void Resize(std::uint64_t size) const;
    void Sync() const;

 private:
    int fd_;
    std::string path_;
};

// Whether anything has that name, be it a dangling symbolic link.
bool Exists(const std::string& path);

// All that a descriptor has to give, such as standard input. Failure when it is more than `most`.
Bytes ReadToEnd(int fd, const std::string& name, std::uint64_t most);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_FILE_H_

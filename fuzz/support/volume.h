// What the targets over whole objects work on: a folder in memory, extended attributes, and the
// surroundings that a real volume would have.
//
// Linked into a program this stands in for parts of the C library and of the platform library:
//   listxattr, getxattr, setxattr, removexattr   kept by path in the program's own memory
//   stat, fopen                                  "<object>/rsrc", a file's resource fork, is the
//                                                file "<object>#rsrc"
//   sync                                         does nothing
//   system, MLIBCExec                            /bin/cp, /bin/mv and /bin/rm without a process
//   MAVOGetFSType                                what VolumeType() says
#ifndef MAVOEA_FUZZ_SUPPORT_VOLUME_H_
#define MAVOEA_FUZZ_SUPPORT_VOLUME_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "fuzz/support/platform.h"

namespace mavoea::fuzz {

using Bytes = std::vector<std::uint8_t>;
using View = std::span<const std::uint8_t>;

// An input, taken apart from its front; past its end there are zeros.
class Input {
 public:
    explicit Input(View bytes) : left_(bytes) {}
    Input(const std::uint8_t* bytes, std::size_t size) : left_(bytes, size) {}

    std::uint8_t U8();
    std::uint16_t U16();          // big-endian
    View Take(std::size_t size);  // what is left of that
    View Rest() { return Take(left_.size()); }
    bool empty() const { return left_.empty(); }

 private:
    View left_;
};

// The folder, made for the first who asks and removed with the process: its path.
const std::string& Folder();

void Put(const std::string& path, View bytes);  // makes or replaces a file
// Nothing where there is no regular file; its access time stays.
std::optional<Bytes> Get(const std::string& path);
bool IsThere(const std::string& path);     // links are not followed
void Empty(const std::string& directory);  // removes all that is in it

// A file without a name, from its start.
int MemoryFile(View bytes);
Bytes GetAll(int fd);

// Extended attributes of whatever path. They take no memory of the heap.
void ClearAttributes();
void PutAttribute(const std::string& path, const std::string& name, View value);
std::optional<Bytes> GetAttribute(const std::string& path, const std::string& name);

// What MAVOGetFSType() answers.
int& VolumeType();

// The number that the next descriptor gets.
int NextDescriptor();

// Closes `fd` where it is the file at `path`: for what is required to keep one. Whether it was.
bool CloseKept(int fd, const std::string& path);

// Watches one call: what it records, and that descriptors, memory, effective user and working
// directory are as before.
class Call {
 public:
    explicit Call(const char* name);

    // The call is over. Fails unless it left everything as it was and took at most `memory` bytes
    // of the heap in all. The codes that it recorded; all of them known ones.
    std::vector<int> End(std::size_t memory);

 private:
    const char* name_;
    int next_descriptor_;
    std::optional<AllocationWatch> watch_;
};

// Reading one file, a call takes this much memory at most.
inline std::size_t MemoryFor(std::size_t file_size) { return file_size + 64 * 1024; }

// Without a bound to speak of, for calls that write many times.
inline constexpr std::size_t kAnyMemory = std::size_t{1} << 30;

// Once an input: that no descriptor was lost while others were open.
class Descriptors {
 public:
    Descriptors() : before_(OpenDescriptors()) {}
    ~Descriptors() {
        if (OpenDescriptors() != before_) Fail("a descriptor stays open, or too many were closed");
    }
    Descriptors(const Descriptors&) = delete;
    Descriptors& operator=(const Descriptors&) = delete;

 private:
    int before_;
};

}  // namespace mavoea::fuzz

#endif  // MAVOEA_FUZZ_SUPPORT_VOLUME_H_

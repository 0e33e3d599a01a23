// The bytes of one file into another, the cheapest way that the file system has.
#ifndef MAVOEA_TOOLS_TRANSFER_FILE_DATA_H_
#define MAVOEA_TOOLS_TRANSFER_FILE_DATA_H_

#include <sys/stat.h>

#include <cstdint>
#include <functional>
#include <utility>

#include "tools/place/file.h"
#include "tools/transfer/manner.h"

namespace mavoea::tool {

struct DataWatch {
    // Told of data as it is copied, in bytes since the last call.
    std::function<void(std::uint64_t)> on_bytes = [](std::uint64_t) {};

    // Asked between pieces of 16 MiB, and while there is nothing to read. Once it is true, copying
    // ends with a Failure.
    std::function<bool()> give_up = [] { return false; };
};

// Copies one file after the other, and remembers between which file systems blocks cannot be
// shared. All members throw Failure.
class FileData {
 public:
    FileData(DataWatch watch, Sparse sparse, Reflink reflink)
        : watch_(std::move(watch)), sparse_(sparse), reflink_(reflink) {}

    // A regular file; `to` is empty. Shares the blocks where both are on a file system that can;
    // otherwise, when all is there, reads it back where `to` can be read, and compares.
    void Copy(const File& from, const File& to);

    // Tells of the bytes that this would copy.
    void Foresee(const File& from) const;

    // Whatever can be read, until it ends, into whatever can be written. `from` does not block.
    void CopyStream(const File& from, const File& to);

 private:
    bool TryToShare(const File& from, const struct stat& info, const File& to);
    bool TryToCopySmall(const File& from, const struct stat& info, const File& to);
    void Ask(const File& from) const;

    friend class LargeCopy;

    DataWatch watch_;
    Sparse sparse_;
    Reflink reflink_;
    std::pair<dev_t, dev_t> apart_{};  // file systems that share no blocks
    Bytes buffer_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_FILE_DATA_H_

// The bytes of one file into another, the cheapest way that the file system has.
#ifndef MAVOEA_TOOLS_TRANSFER_FILE_DATA_H_
#define MAVOEA_TOOLS_TRANSFER_FILE_DATA_H_

#include <cstdint>
#include <functional>

#include "tools/place/file.h"

namespace mavoea::tool {

struct DataWatch {
    // Told of data as it is copied, in bytes since the last call.
    std::function<void(std::uint64_t)> on_bytes = [](std::uint64_t) {};

    // Asked between pieces of 16 MiB, and while there is nothing to read. Once it is true, copying
    // ends with a Failure.
    std::function<bool()> give_up = [] { return false; };
};

// Regular files; `to` is empty. Shares the blocks where both are on a file system that can, and
// otherwise keeps holes as holes and, when all is there, reads both and compares them. Both throw
// Failure.
void CopyData(const File& from, const File& to, const DataWatch& watch);

// Whatever can be read, until it ends. `from` does not block.
void CopyStream(const File& from, const File& to, const DataWatch& watch);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_FILE_DATA_H_

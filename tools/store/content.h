// The bytes of something, wherever they are: in memory, or a stretch of an open file that is read
// as it is needed.
#ifndef MAVOEA_TOOLS_STORE_CONTENT_H_
#define MAVOEA_TOOLS_STORE_CONTENT_H_

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "tools/place/file.h"

namespace mavoea::tool {

// A whole metadata file, for a place that keeps its like: no byte of it need be understood.
using WholeFile = std::shared_ptr<const File>;

// The most that is read at once, and held in memory.
inline constexpr std::uint64_t kSmallFile = std::uint64_t{1} << 18;

class Content {
 public:
    Content() = default;
    explicit Content(Bytes bytes) : size_(bytes.size()), bytes_(std::move(bytes)) {}
    // A stretch that passes the end of the file is damaged.
    Content(std::shared_ptr<const File> file, std::uint64_t offset, std::uint64_t size);

    // What cannot be read, and why; `size` is what it is said to have.
    static Content Damaged(std::uint64_t size, std::string problem);

    std::uint64_t size() const { return size_; }
    bool damaged() const { return !problem_.empty(); }
    const std::string& problem() const { return problem_; }

    // What of it is there: all of it, unless it is damaged.
    Content Readable() const;

    // Both throw Failure, for what is damaged too. Up to `size` bytes at `offset`, fewer only at
    // the end.
    Bytes Read(std::uint64_t offset, std::uint64_t size) const;
    Bytes All() const { return Read(0, size_); }

 private:
    std::uint64_t size_ = 0;
    Bytes bytes_;
    std::shared_ptr<const File> file_;
    std::uint64_t offset_ = 0;
    std::string problem_;
};

// The first byte at which they differ; none when they are the same. Throws Failure.
std::optional<std::uint64_t> FirstDifference(const Content& one, const Content& other);

// False for what is damaged. Throws Failure.
bool SameContent(const Content& one, const Content& other);

// Appends all of it to the file at `offset`, piece by piece. Returns where it ends.
std::uint64_t WriteTo(const File& file, std::uint64_t offset, const Content& content);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_CONTENT_H_

#include "tools/store/content.h"

#include <algorithm>

#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;
constexpr const char* kLook = "look at it with: mavoea dump FILE";

}  // namespace

Content::Content(std::shared_ptr<const File> file, std::uint64_t offset, std::uint64_t size)
    : size_(size), file_(std::move(file)), offset_(offset) {
    const std::uint64_t file_size = file_->Size();
    if (size > 0 && (offset > file_size || size > file_size - offset)) {
        problem_ = "it passes the end of " + Printable(file_->path());
    }
}

Content Content::Damaged(std::uint64_t size, std::string problem) {
    Content content;
    content.size_ = size;
    content.problem_ = std::move(problem);
    return content;
}

Content Content::Readable() const {
    if (!damaged()) return *this;
    const std::uint64_t file_size = file_ ? file_->Size() : 0;
    if (offset_ >= file_size) return {};
    return {file_, offset_, std::min(size_, file_size - offset_)};
}

Bytes Content::Read(std::uint64_t offset, std::uint64_t size) const {
    if (damaged()) {
        throw Failure(kFailed, file_ ? file_->path() : "metadata", "damaged: " + problem_, kLook,
                      Fault::kDamage);
    }
    if (offset >= size_) return {};
    const std::uint64_t wanted = std::min(size, size_ - offset);
    if (!file_) {
        const auto begin = bytes_.begin() + static_cast<std::ptrdiff_t>(offset);
        return {begin, begin + static_cast<std::ptrdiff_t>(wanted)};
    }
    Bytes bytes = file_->Read(offset_ + offset, wanted);
    if (bytes.size() == wanted) return bytes;
    throw Failure(kFailed, file_->path(), "it became shorter while it was read", "try again");
}

std::optional<std::uint64_t> FirstDifference(const Content& one, const Content& other) {
    for (std::uint64_t at = 0;; at += kPiece) {
        const Bytes here = one.Read(at, kPiece);
        const Bytes there = other.Read(at, kPiece);
        const auto [differs, same] =
            std::mismatch(here.begin(), here.end(), there.begin(), there.end());
        if (differs != here.end() || same != there.end()) {
            return at + static_cast<std::uint64_t>(differs - here.begin());
        }
        if (here.size() < kPiece) return std::nullopt;
    }
}

bool SameContent(const Content& one, const Content& other) {
    return !one.damaged() && !other.damaged() && one.size() == other.size() &&
           !FirstDifference(one, other);
}

std::uint64_t WriteTo(const File& file, std::uint64_t offset, const Content& content) {
    for (std::uint64_t at = 0; at < content.size(); at += kPiece) {
        file.Write(offset + at, content.Read(at, kPiece));
    }
    return offset + content.size();
}

}  // namespace mavoea::tool

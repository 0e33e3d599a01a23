// Paths as text: where an object's name begins, and results that are cut short.
#ifndef MAVOEA_UTIL_PATH_TEXT_H_
#define MAVOEA_UTIL_PATH_TEXT_H_

#include <string.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <type_traits>

#include "util/bytes.h"
#include "util/owned.h"

namespace mavoea {

// Longest path, without its NUL, that a WorkingPath holds on the stack.
inline constexpr std::size_t kShortPathMax = 4094;

// Room for every path that the library derives, and its NUL.
inline constexpr int kPathBufferSize = MAVOEA_PATH_SIZE + 1;

// How long a metadata path may be where the library derives one for itself.
inline constexpr int kDerivedPathMax = MAVOEA_PATH_SIZE - 1;

struct ObjectPath {
    std::string_view parent;  // with its '/'; empty when the path has none
    std::string_view name;
};

constexpr ObjectPath SplitObject(std::string_view path) {
    std::size_t name = 0;
    if (std::is_constant_evaluated()) {
        name = path.rfind('/') + 1;  // npos + 1 is 0
    } else {
        const auto* const slash = static_cast<const char*>(memrchr(path.data(), '/', path.size()));
        if (slash != nullptr) name = static_cast<std::size_t>(slash - path.data()) + 1;
    }
    return {std::string_view(path.data(), name),
            std::string_view(path.data() + name, path.size() - name)};
}

static_assert(SplitObject("/v/a").parent == "/v/" && SplitObject("/v/a").name == "a");
static_assert(SplitObject("a").parent.empty() && SplitObject("a").name == "a");
static_assert(SplitObject("/v/").parent == "/v/" && SplitObject("/v/").name.empty());

constexpr std::string_view WithoutTrailingSlash(std::string_view path) {
    if (!path.empty() && path.back() == '/') path.remove_suffix(1);
    return path;
}

static_assert(WithoutTrailingSlash("/v/a/") == "/v/a" && WithoutTrailingSlash("/v/a//") == "/v/a/");
static_assert(WithoutTrailingSlash("/").empty() && WithoutTrailingSlash("").empty());

// A copy of a path to work on. Short paths, as all that the kernel takes are, stay on the stack.
class WorkingPath {
 public:
    // cppcheck-suppress uninitMemberVar; clearing it would cost more than the rest of a derivation
    explicit WorkingPath(const char* path) : size_(strlen(path)) {
        if (size_ > kShortPathMax) heap_ = Owned<char>::Allocate(size_ + 1);
        if (ok()) CopyBytes(data(), path, size_ + 1);
    }

    bool ok() const { return size_ <= kShortPathMax || heap_; }  // false: out of memory
    char* data() { return size_ <= kShortPathMax ? stack_ : heap_.get(); }
    std::string_view text() { return {data(), size_}; }

 private:
    std::size_t size_;
    Owned<char> heap_;
    char stack_[kShortPathMax + 1];
};

// A path from which a result is derived that may be written over it: a copy where the two overlap.
// Paths that are too long for the stack are copied whatever, so that memory can always run out for
// them, as callers have been told.
class SourcePath {
 public:
    SourcePath(const char* path, const char* result, int result_size) : text_(path) {
        if (text_.size() <= kShortPathMax && !Overlaps(result, result_size)) return;
        copy_.emplace(path);
        if (copy_->ok()) text_ = copy_->text();
    }

    bool ok() const { return !copy_ || copy_->ok(); }  // false: out of memory
    std::string_view text() const { return text_; }

 private:
    // A result may have one byte more, its NUL. Addresses in 64 bits, in which no end passes the
    // last one.
    bool Overlaps(const char* result, int result_size) const {
        const std::uint64_t from = reinterpret_cast<std::uintptr_t>(text_.data());
        const std::uint64_t to = reinterpret_cast<std::uintptr_t>(result);
        return result_size > 0 && from <= to + static_cast<unsigned>(result_size) &&
               to <= from + text_.size();
    }

    std::string_view text_;
    std::optional<WorkingPath> copy_;
};

// Writes text into a buffer of at least one byte as snprintf does: what does not fit is dropped,
// and the result always ends in a NUL.
class CutShort {
 public:
    CutShort(char* buffer, int size) : at_(buffer), left_(static_cast<std::size_t>(size) - 1) {
        *at_ = '\0';
    }

    CutShort& Add(std::string_view text) {
        const std::size_t count = std::min(text.size(), left_);
        CopyBytes(at_, text.data(), count);
        at_ += count;
        left_ -= count;
        *at_ = '\0';
        return *this;
    }

 private:
    char* at_;
    std::size_t left_;
};

// Writes text into a buffer that the caller has measured; Finish() adds the NUL.
class PathWriter {
 public:
    explicit PathWriter(char* at) : at_(at) {}

    PathWriter& Add(std::string_view text) {
        CopyBytes(at_, text.data(), text.size());
        at_ += text.size();
        return *this;
    }

    char* Finish() {
        *at_ = '\0';
        return at_;
    }

 private:
    char* at_;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_PATH_TEXT_H_

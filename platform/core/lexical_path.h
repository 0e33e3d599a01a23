// Absolute paths as text: "/v//a/./b/../c/" is "/v/a/c". Symbolic links are not looked at.
#ifndef MAVOEA_PLATFORM_CORE_LEXICAL_PATH_H_
#define MAVOEA_PLATFORM_CORE_LEXICAL_PATH_H_

#include <errno.h>
#include <limits.h>
#include <stdlib.h>

#include <cstddef>
#include <string_view>

namespace mavoea::core {

constexpr bool IsAbsolute(std::string_view path) { return !path.empty() && path.front() == '/'; }

// Writes the components of an absolute path, each behind a '/', without empty and "." ones and with
// ".." resolved. The root is thus the empty string, and a prefix of every path. Returns the size,
// which never passes the path's own; no NUL is written.
constexpr std::size_t NormalizePath(std::string_view path, char* out) {
    std::size_t size = 0;
    for (std::size_t at = 0; at < path.size();) {
        if (path[at] == '/') {
            ++at;
            continue;
        }
        std::size_t end = at;
        while (end < path.size() && path[end] != '/') ++end;
        const std::string_view component(path.data() + at, end - at);
        if (component == "..") {
            while (size > 0 && out[--size] != '/') {
            }
        } else if (component != ".") {
            out[size++] = '/';
            for (char c : component) out[size++] = c;
        }
        at = end;
    }
    return size;
}

// Whether `path` is the normalized directory `directory` or something in it, by whole components.
// (starts_with() would need libstdc++ in a build without optimization.)
constexpr bool IsInside(std::string_view path, std::string_view directory) {
    return path.size() >= directory.size() &&
           std::string_view(path.data(), directory.size()) == directory &&
           (path.size() == directory.size() || path[directory.size()] == '/');
}

static_assert(IsInside("/v/a", "/v") && IsInside("/v", "/v") && IsInside("/v", ""));
static_assert(!IsInside("/volume", "/v") && !IsInside("/", "/v") && IsInside("", ""));

// The normalized text of an absolute path. Paths that the kernel takes stay on the stack.
class LexicalPath {
 public:
    explicit LexicalPath(std::string_view path) {
        if (path.size() >= sizeof stack_) {
            heap_ = static_cast<char*>(malloc(path.size() + 1));
            if (heap_ == nullptr) return;
        }
        data_ = heap_ != nullptr ? heap_ : stack_;
        size_ = NormalizePath(path, data_);
    }
    ~LexicalPath() {
        const int saved = errno;
        free(heap_);
        errno = saved;
    }
    LexicalPath(const LexicalPath&) = delete;
    LexicalPath& operator=(const LexicalPath&) = delete;

    bool ok() const { return data_ != nullptr; }  // false: out of memory
    std::string_view text() const { return {data_, size_}; }

    // Turns the path into its parent's; the root has none.
    void CutLast() {
        while (size_ > 0 && data_[--size_] != '/') {
        }
    }

    // Ended by a NUL, and "/" for the root. Only for paths below PATH_MAX.
    const char* c_str() {
        if (size_ == 0) return "/";
        data_[size_] = '\0';
        return data_;
    }

 private:
    char* heap_ = nullptr;
    char* data_ = nullptr;
    std::size_t size_ = 0;
    char stack_[PATH_MAX];
};

}  // namespace mavoea::core

#endif  // MAVOEA_PLATFORM_CORE_LEXICAL_PATH_H_

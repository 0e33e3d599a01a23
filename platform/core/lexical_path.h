// Absolute paths as text: "/v//a/./b/../c/" is "/v/a/c". Symbolic links are not looked at.
#ifndef MAVOEA_PLATFORM_CORE_LEXICAL_PATH_H_
#define MAVOEA_PLATFORM_CORE_LEXICAL_PATH_H_

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

}  // namespace mavoea::core

#endif  // MAVOEA_PLATFORM_CORE_LEXICAL_PATH_H_

// Attributes as Macs name them, on filesystems that do not have them: "com.apple.FinderInfo" stands
// under a user's name, and "<object>/rsrc" for a file beside the object. Every other attribute is a
// real one.
#ifndef MAVOEA_TESTS_SUPPORT_MAC_ATTRIBUTES_H_
#define MAVOEA_TESTS_SUPPORT_MAC_ATTRIBUTES_H_

#include <errno.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <algorithm>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "tests/support/kernel_control.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

using Attributes = std::map<std::string, Bytes>;

inline constexpr char kMacFinderInfo[] = "com.apple.FinderInfo";
inline constexpr char kMacFork[] = "com.apple.ResourceFork";

// Where a stand-in for the platform's system call may keep a mark; nobody is told of it.
inline constexpr char kHiddenMark[] = "user.test.hidden";

inline std::string RealName(const std::string& name) {
    return name == kMacFinderInfo ? "user.test.FinderInfo" : name;
}
inline std::string ForkFile(const std::string& object) { return object + ".fork"; }
inline std::string Viewed(const std::string& path) {
    constexpr std::string_view kView = "/rsrc";
    if (!path.ends_with(kView)) return path;
    return ForkFile(path.substr(0, path.size() - kView.size()));
}

inline void SetAttribute(const std::string& object, const std::string& name, const Bytes& value) {
    if (name == kMacFork) {
        WriteFile(ForkFile(object), value);
        return;
    }
    ASSERT_EQ(0, ::setxattr(object.c_str(), RealName(name).c_str(), value.data(), value.size(), 0))
        << name << ": " << strerror(errno);
}

// Nothing when there is no such attribute.
inline Bytes AttributeOf(const std::string& object, const std::string& name) {
    if (name == kMacFork) return ReadFile(ForkFile(object));
    Bytes value(65536);
    const ssize_t size =
        ::getxattr(object.c_str(), RealName(name).c_str(), value.data(), value.size());
    value.resize(size < 0 ? 0 : static_cast<size_t>(size));
    return value;
}

// The real ones, and the fork where it is not empty. Sorted, so that no filesystem's order matters.
inline std::vector<std::string> NamesOf(const std::string& object) {
    char names[4096];
    const ssize_t size = ::listxattr(object.c_str(), names, sizeof names);
    std::vector<std::string> all;
    for (const char* name = names; name < names + size; name += strlen(name) + 1) {
        if (strncmp(name, "user.", 5) != 0 || strcmp(name, kHiddenMark) == 0) continue;
        all.emplace_back(name == RealName(kMacFinderInfo) ? kMacFinderInfo : name);
    }
    if (Exists(ForkFile(object)) && !ReadFile(ForkFile(object)).empty()) all.emplace_back(kMacFork);
    std::sort(all.begin(), all.end());
    return all;
}

inline Attributes AttributesOf(const std::string& object) {
    Attributes found;
    for (const std::string& name : NamesOf(object)) found[name] = AttributeOf(object, name);
    return found;
}

// What listxattr(2) answers when an object has these.
inline ssize_t ListNames(const std::vector<std::string>& names, char* to, size_t size) {
    std::string all;
    for (const std::string& name : names) all += name + '\0';
    if (size != 0 && all.size() > size) {
        errno = ERANGE;
        return -1;
    }
    if (size != 0) memcpy(to, all.data(), all.size());
    return static_cast<ssize_t>(all.size());
}

// The hooks by which the library sees all this.
inline void StandInForMacAttributes() {
    KernelHooks& hooks = Hooks();
    hooks.stat = [](const char* path, struct stat* info) {
        return ::stat(Viewed(path).c_str(), info);
    };
    hooks.fopen = [](const char* path, const char* mode) {
        return ::fopen(Viewed(path).c_str(), mode);
    };
    hooks.getxattr = [](const char* path, const char* name, void* value, size_t size) {
        return ::getxattr(path, RealName(name).c_str(), value, size);
    };
    hooks.setxattr = [](const char* path, const char* name, const void* value, size_t size,
                        int flags) {
        return ::setxattr(path, RealName(name).c_str(), value, size, flags);
    };
    hooks.listxattr = [](const char* path, char* names, size_t size) {
        return ListNames(NamesOf(path), names, size);
    };
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_MAC_ATTRIBUTES_H_

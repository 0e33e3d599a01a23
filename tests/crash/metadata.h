// What is left of metadata after a crash: read through the library, with every one of its readers,
// and item by item, so that what was lost can be named.
#ifndef MAVOEA_TESTS_CRASH_METADATA_H_
#define MAVOEA_TESTS_CRASH_METADATA_H_

#include <fcntl.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

// "fork", "Finder info", and attributes by their names.
using Items = std::map<std::string, Bytes>;

inline constexpr char kForkItem[] = "fork";
inline constexpr char kFinderItem[] = "Finder info";

// A stream as the library reads it.
struct Look {
    int refusal = 0;  // the code of a refused open
    Items items = {};
};

// Opens the stream on `fd` for reading and reads all of it in every way there is. A refusal must
// have a code that opening is documented to give; what is read must fit what was asked for.
inline Look LookAtStream(int fd) {
    constexpr std::size_t kMost = std::size_t{1} << 20;
    Look look;
    (void)TakeRecords();
    const int count = EASGetEntryCount(fd);
    EASHandle* const h = MAVOEASOpen(fd, F_RDLCK);
    if (h == nullptr) {
        look.refusal = MLIBCErrGet();
        EXPECT_TRUE(look.refusal == 0xA00 || look.refusal == 0xD00) << look.refusal;
        return look;
    }
    MLIBCSzList* list = NewList();
    const int listed = MAVOEASEnum(h, &list);
    const std::vector<std::string> names = Strings(list);
    MLIBCSzListFree(list);
    EXPECT_EQ(count, listed);
    EXPECT_EQ(static_cast<int>(names.size()), listed);
    for (const std::string& name : names) {
        EXPECT_LE(0, MAVOEASSearch(h, name.c_str()));
        Bytes value(1);
        const int length = MAVOEASRead(h, name.c_str(), value.data(), 0, 0);
        value.assign(std::min<std::size_t>(static_cast<unsigned>(length), kMost) + 1, 0xEE);
        const auto size = static_cast<unsigned>(value.size());
        const int got = MAVOEASRead(h, name.c_str(), value.data(), size, 0);
        EXPECT_LE(got, static_cast<int>(size));
        if (got != length) value = Ascii("(cannot be read)");
        if (got == length) value.resize(static_cast<std::size_t>(got));
        Bytes end(4);
        if (length > 3) {
            (void)MAVOEASRead(h, name.c_str(), end.data(), 4, static_cast<unsigned>(length) - 3);
        }
        look.items[name] = value;
    }
    look.items[kFinderItem] = Bytes(h->header + kFinderInfoAt, h->header + kFinderInfoAt + 32);
    const std::uint32_t at = U32At(h->header, kForkOffsetAt);
    Bytes fork(std::min<std::size_t>(U32At(h->header, kForkLengthAt), kMost));
    const ssize_t got = ::pread(fd, fork.data(), fork.size(), static_cast<off_t>(at));
    fork.resize(got < 0 ? 0 : static_cast<std::size_t>(got));
    look.items[kForkItem] = fork;
    EXPECT_EQ(0, MAVOEASClose(h));
    return look;
}

inline Look LookAtStream(const std::string& path) {
    const int fd = ::open(path.c_str(), O_RDONLY);
    if (fd < 0) return {};
    const Look look = LookAtStream(fd);
    ::close(fd);
    return look;
}

// Has the library read every file below `root` as everything that it may be.
inline void ReadEverything(const std::string& root) {
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root)) {
        if (!entry.is_regular_file() || entry.is_symlink()) continue;
        const std::string path = entry.path().string();
        (void)LookAtStream(path);
        (void)MAVOEACheckADFile(path.c_str());
        std::uint8_t head[1024];
        const int fd = ::open(path.c_str(), O_RDONLY);
        const ssize_t size = ::read(fd, head, sizeof head);
        ::close(fd);
        EAAdouble record = {};
        (void)MAVOEAAdoubleRead(head, static_cast<int>(size), &record);
        (void)MAVOEAEADirAdoubleRead(path.c_str(), &record);
        (void)MAVOEAFileEAAdoubleRead(path.c_str(), &record);
    }
}

// All that is below `root`: names, modes, contents and attributes.
inline std::string Everything(const std::string& root) {
    std::vector<std::string> files;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root)) {
        const std::string path = entry.path().string();
        std::string file = path + "\n" + std::to_string(ModeOf(path)) + "\n";
        char buffer[8192];
        ssize_t size = ::listxattr(path.c_str(), buffer, sizeof buffer);
        const std::string names(buffer, size < 0 ? 0 : static_cast<std::size_t>(size));
        for (std::size_t at = 0; at < names.size(); at += strlen(&names[at]) + 1) {
            size = ::getxattr(path.c_str(), &names[at], buffer, sizeof buffer);
            file.append(&names[at]).append(buffer, size < 0 ? 0 : static_cast<std::size_t>(size));
        }
        const int fd = entry.is_regular_file() ? ::open(path.c_str(), O_RDONLY) : -1;
        while (fd >= 0 && (size = ::read(fd, buffer, sizeof buffer)) > 0) {
            file.append(buffer, static_cast<std::size_t>(size));
        }
        if (fd >= 0) ::close(fd);
        files.push_back(file);
    }
    std::sort(files.begin(), files.end());
    std::string all;
    for (const std::string& file : files) all += file + "\n";
    return all;
}

// What an AppleDouble file holds; nothing when it is none.
inline Items ItemsOfMacFile(const std::string& path) {
    if (!Exists(path)) return {};
    const auto contents = ReadMacFile(ReadFile(path));
    if (!contents) return {};
    Items items(contents->attributes.begin(), contents->attributes.end());
    items[kFinderItem] = contents->finder_info;
    items[kForkItem] = contents->fork;
    return items;
}

// The names of the `wanted` items that `found` has, as they are wanted.
inline std::set<std::string> WholeIn(const Items& found, const Items& wanted) {
    std::set<std::string> whole;
    for (const auto& [name, value] : wanted) {
        const auto at = found.find(name);
        if (at != found.end() && at->second == value) whole.insert(name);
    }
    return whole;
}

inline std::string Listed(const std::set<std::string>& names) {
    std::string text;
    for (const std::string& name : names) text += (text.empty() ? "" : ", ") + name;
    return text;
}

// "all", "none", or which.
inline std::string Share(const std::set<std::string>& names, const Items& wanted) {
    if (names.empty()) return "none";
    return names.size() == wanted.size() ? "all" : Listed(names);
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_CRASH_METADATA_H_

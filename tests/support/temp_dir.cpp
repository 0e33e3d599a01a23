#include "tests/support/temp_dir.h"

#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>

namespace mavoea::test {
namespace {

// Tests expect the modes that the usual umask gives, and let other users into their directories.
[[maybe_unused]] const mode_t kFormerUmask = umask(022);

[[noreturn]] void Die(const std::string& why) {
    fprintf(stderr, "test support: %s\n", why.c_str());
    abort();
}

}  // namespace

Bytes Hex(std::string_view text) {
    Bytes bytes;
    std::size_t at = 0;
    while (at < text.size()) {
        const char c = text[at];
        if (c == ' ' || c == '\n' || c == '\t') {
            ++at;
        } else if (c == '\'') {
            const auto end = text.find('\'', at + 1);
            if (end == std::string_view::npos) Die("text without end in Hex()");
            for (char t : text.substr(at + 1, end - at - 1)) {
                bytes.push_back(static_cast<std::uint8_t>(t));
            }
            at = end + 1;
        } else if (c == '*') {
            std::size_t count = 0;
            const auto [end, error] =
                std::from_chars(text.data() + at + 1, text.data() + text.size(), count);
            if (error != std::errc{} || count == 0 || bytes.empty()) Die("bad count in Hex()");
            bytes.insert(bytes.end(), count - 1, std::uint8_t{bytes.back()});
            at = static_cast<std::size_t>(end - text.data());
        } else {
            unsigned value = 0;
            const auto [end, error] = std::from_chars(
                text.data() + at, text.data() + std::min(at + 2, text.size()), value, 16);
            if (error != std::errc{} || end != text.data() + at + 2) Die("bad digits in Hex()");
            bytes.push_back(static_cast<std::uint8_t>(value));
            at += 2;
        }
    }
    return bytes;
}

Bytes operator+(Bytes left, const Bytes& right) {
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

Bytes Repeat(std::uint8_t byte, std::size_t count) { return Bytes(count, byte); }
Bytes Ascii(std::string_view text) { return Bytes(text.begin(), text.end()); }

std::string FastDirectory() {
    constexpr char kMemory[] = "/dev/shm";
    return access(kMemory, W_OK | X_OK) == 0 ? kMemory
                                             : std::filesystem::temp_directory_path().string();
}

TempDir::TempDir() : TempDir(std::filesystem::temp_directory_path().string()) {}

TempDir::TempDir(const std::string& parent) : path_(parent + "/mavoea-test-XXXXXX") {
    if (mkdtemp(path_.data()) == nullptr) Die("cannot make a directory in " + parent);
    chmod(path_.c_str(), 0777);  // Some tests work in it as another user.
}

TempDir::~TempDir() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

std::string TempDir::operator/(std::string_view name) const {
    return path_ + "/" + std::string(name);
}

void WriteFile(const std::string& path, const Bytes& bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()),
              static_cast<std::streamsize>(bytes.size()));
    out.close();
    if (!out) Die("cannot write " + path);
}

Bytes ReadFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) Die("cannot read " + path);
    Bytes bytes;
    char part[16384];
    do {
        in.read(part, sizeof part);
        bytes.insert(bytes.end(), part, part + in.gcount());
    } while (in);
    return bytes;
}

bool Exists(const std::string& path) {
    struct stat info;
    return lstat(path.c_str(), &info) == 0;
}

int ModeOf(const std::string& path) {
    struct stat info;
    return lstat(path.c_str(), &info) == 0 ? static_cast<int>(info.st_mode & 07777) : -1;
}

std::vector<std::string> NamesIn(const std::string& directory) {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(directory)) {
        names.push_back(entry.path().filename().string());
    }
    std::sort(names.begin(), names.end());
    return names;
}

}  // namespace mavoea::test

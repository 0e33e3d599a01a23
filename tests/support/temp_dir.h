// A directory of a test's own, and files in it.
#ifndef MAVOEA_TESTS_SUPPORT_TEMP_DIR_H_
#define MAVOEA_TESTS_SUPPORT_TEMP_DIR_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace mavoea::test {

using Bytes = std::vector<std::uint8_t>;

// Bytes written out by hand: hexadecimal digits, white space between, '...' for ASCII text and
// "*<count>" after a byte to repeat it: "00 05 16 07 'ATTR' 00*12". Aborts on anything else.
Bytes Hex(std::string_view text);

Bytes operator+(Bytes left, const Bytes& right);
Bytes Repeat(std::uint8_t byte, std::size_t count);
Bytes Ascii(std::string_view text);

// Where temporary directories are quickest: in memory where there is a place for that.
std::string FastDirectory();

// Removed, with all that it holds, at the end of its scope.
class TempDir {
 public:
    TempDir();
    // Below `parent`, for a filesystem of the test's choosing.
    explicit TempDir(const std::string& parent);
    ~TempDir();
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;

    const std::string& path() const { return path_; }
    std::string operator/(std::string_view name) const;

 private:
    std::string path_;
};

void WriteFile(const std::string& path, const Bytes& bytes);
Bytes ReadFile(const std::string& path);
bool Exists(const std::string& path);  // lstat: a dangling symbolic link exists
int ModeOf(const std::string& path);   // permission bits, -1 when there is nothing
std::vector<std::string> NamesIn(const std::string& directory);  // sorted

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_TEMP_DIR_H_

// Where a test works.
#ifndef MAVOEA_TESTS_SUPPORT_WORKING_DIRECTORY_H_
#define MAVOEA_TESTS_SUPPORT_WORKING_DIRECTORY_H_

#include <filesystem>
#include <string>

namespace mavoea::test {

// The working directory until the end of its scope.
class WorkingDirectory {
 public:
    explicit WorkingDirectory(const std::string& path) : former_(std::filesystem::current_path()) {
        std::filesystem::current_path(path);
    }
    ~WorkingDirectory() { std::filesystem::current_path(former_); }
    WorkingDirectory(const WorkingDirectory&) = delete;
    WorkingDirectory& operator=(const WorkingDirectory&) = delete;

 private:
    std::filesystem::path former_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_WORKING_DIRECTORY_H_

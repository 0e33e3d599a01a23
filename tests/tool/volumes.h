// Directories beside each other that are volumes of several kinds.
#ifndef MAVOEA_TESTS_TOOL_VOLUMES_H_
#define MAVOEA_TESTS_TOOL_VOLUMES_H_

#include <filesystem>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/object_files.h"
#include "tests/tool/tool.h"

namespace mavoea::test {

// All that is in a directory: the bytes of files, and what else there is.
inline std::map<std::string, Bytes> Contents(const std::string& directory) {
    std::map<std::string, Bytes> all;
    for (const std::string& name : Tree(directory)) {
        const std::filesystem::path path = directory + '/' + name;
        const bool is_file =
            std::filesystem::is_regular_file(std::filesystem::symlink_status(path));
        all[name] = is_file ? ReadFile(path) : Bytes();
    }
    return all;
}

// Volumes beside each other, each a directory that is declared to be of a type.
class Volumes {
 public:
    const std::string& path() const { return dir_.path(); }

    // It need not be there yet; it is declared to the tool once it is.
    std::string Declare(const std::string& name, int type) {
        const std::string volume = dir_ / name;
        declared_.emplace_back(volume, type);
        return volume;
    }

    std::string Make(const std::string& name, int type) {
        const std::string volume = Declare(name, type);
        MakeDir(volume);
        return volume;
    }

    ToolResult Run(const Arguments& arguments, const std::string& input = {}) const {
        Arguments all;
        for (const auto& [volume, type] : declared_) {
            if (!Exists(volume)) continue;
            all.insert(all.end(), {"--volume", volume + '=' + std::to_string(type)});
        }
        all.insert(all.end(), arguments.begin(), arguments.end());
        return RunTool(all, input);
    }

    void Set(const std::string& path, const std::string& name, const Bytes& value) const {
        ASSERT_THAT(Run({"set", path, name}, std::string(value.begin(), value.end())), Succeeded());
    }

    ToolResult Convert(const std::string& from, const std::string& to, const std::string& type,
                       Arguments options = {"-r"}) const {
        options.insert(options.begin(), "convert");
        options.insert(options.end(), {"--to", type, from, to});
        return Run(options);
    }

 private:
    TempDir dir_;
    std::vector<std::pair<std::string, int>> declared_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_VOLUMES_H_

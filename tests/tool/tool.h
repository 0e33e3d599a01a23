// Running the tool on a directory of a test's own.
#ifndef MAVOEA_TESTS_TOOL_TOOL_H_
#define MAVOEA_TESTS_TOOL_TOOL_H_

#include <gmock/gmock.h>
#include <unistd.h>

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "tests/support/emulator.h"
#include "tests/support/temp_dir.h"

// Compiled once, in tool.cpp.
extern template class nlohmann::basic_json<>;
namespace nlohmann {
void PrintTo(const json& value, std::ostream* out);
}

namespace mavoea::test {

struct ToolResult {
    int status = -1;  // exit status, 128 + number when a signal ended it
    std::string out;
    std::string err;

    Bytes bytes() const { return Ascii(out); }
    nlohmann::json json() const;
};
void PrintTo(const ToolResult& result, std::ostream* out);

using Arguments = std::vector<std::string>;

// The tool that is tested. It is that of the tests' own build; the environment may name one of
// another build, which need not be for this kind of processor: MAVOEA_TOOL, MAVOEA_TOOL_EMULATOR
// and MAVOEA_TOOL_SANITIZERS. Once a test is to be another user, it is a copy that every user can
// run.
struct TestedTool {
    std::string path;
    std::string emulator;    // with its arguments; empty: none
    std::string sanitizers;  // those that it is built with; empty: none

    bool emulated() const { return !emulator.empty(); }
    bool sanitized() const { return !sanitizers.empty(); }
    std::string Command() const;  // the words of a shell's command line that start it
};
const TestedTool& Tested();

// Volume types; in an emulator two of them, which make files of every layout.
std::vector<int> Types(std::vector<int> all);

// Each step of a long series, or each seventh where the tool runs in an emulator.
inline std::size_t SeriesStep() { return Tested().emulated() ? kEmulatedSeriesStep : 1; }

template <class T>
std::vector<T> Thinned(const std::vector<T>& all, std::size_t step) {
    std::vector<T> some;
    for (std::size_t i = 0; i < all.size(); i += step) some.push_back(all[i]);
    return some;
}

// Of many ways to do the same, between each two kinds of volumes for example, a sanitizer sees with
// each third what it sees with all.
template <class T>
std::vector<T> Thinned(const std::vector<T>& ways) {
    return Thinned(ways, Tested().sanitized() ? 3 : SeriesStep());
}

// What the tool may use, 0 for as much as it likes. A limit on memory has no effect under a
// sanitizer and in an emulator, which need much of their own.
struct Limits {
    std::size_t memory = 0;      // in bytes
    std::size_t file_size = 0;   // in bytes, of every file that it writes, its output too
    std::size_t open_files = 0;  // at any time
    uid_t user = 0;              // the superuser runs it as that user for good, and as that group
};

// What starts the tool in place of a process; made before a fork, so that the child need not
// allocate.
class ToolStart {
 public:
    explicit ToolStart(const Arguments& arguments);
    ToolStart(const ToolStart&) = delete;
    ToolStart& operator=(const ToolStart&) = delete;

    void Exec() { execvp(argv_[0], argv_.data()); }  // returns only when it cannot be started

 private:
    Arguments words_;
    std::vector<char*> argv_;
};

ToolResult RunTool(const Arguments& arguments, const std::string& input = {}, Limits limits = {});

// Matches a run that succeeded and said nothing on standard error.
MATCHER(Succeeded, "") { return arg.status == 0 && arg.err.empty(); }

// Matches a run that ended with this status and this line on standard error, and nothing else.
MATCHER_P2(Failed, status, message, "") {
    return arg.status == status && arg.err == "mavoea: " + std::string(message) + "\n";
}

// A directory that is declared to be a volume of a type, with one file in it.
class Volume {
 public:
    explicit Volume(int type) : type_(std::to_string(type)) { WriteFile(object(), Ascii("data")); }
    Volume(int type, const std::string& parent) : dir_(parent), type_(std::to_string(type)) {
        WriteFile(object(), Ascii("data"));
    }

    const std::string& path() const { return dir_.path(); }
    std::string object() const { return dir_ / "file.txt"; }
    std::string stream() const { return dir_ / "@eaDir/file.txt@MavoEAStream"; }
    std::string resource() const { return dir_ / "@eaDir/file.txt@MavoResource"; }
    std::string apple_double() const { return dir_ / "._file.txt"; }

    // Where named attributes go on this volume.
    std::string attribute_file() const {
        return type_ == "0" || type_ == "5" ? apple_double() : stream();
    }
    // Where Finder info is looked for first.
    std::string finder_info_file() const { return type_ == "2" ? object() : finder_file(); }
    // Where Finder info and resource fork go.
    std::string finder_file() const {
        return type_ == "0" || type_ == "5" ? apple_double() : resource();
    }

    int type() const { return std::stoi(type_); }

    // The tool with the volume declared.
    ToolResult Run(Arguments arguments, const std::string& input = {}, Limits limits = {}) const {
        arguments.insert(arguments.begin(), {"--volume", path() + "=" + type_});
        return RunTool(arguments, input, limits);
    }

    ToolResult List() const { return Run({"list", object()}); }
    ToolResult Get(const std::string& name) const { return Run({"get", object(), name}); }
    ToolResult Remove(const std::string& name) const { return Run({"remove", object(), name}); }
    ToolResult Set(const std::string& name, const Bytes& value) const {
        return Run({"set", object(), name}, std::string(value.begin(), value.end()));
    }

 private:
    TempDir dir_;
    std::string type_;
};

// Whether files in that directory keep extended attributes of users.
bool KeepsUserAttributes(const std::string& directory);

// Records, marks and flush times of files are attributes of users.
#define MAVOEA_SKIP_WITHOUT_ATTRIBUTES(directory)                                            \
    if (!KeepsUserAttributes(directory)) {                                                   \
        GTEST_SKIP() << "files in " << directory << " keep no extended attributes of users"; \
    }

// Whether files in that directory can be given to any user: a user namespace has some only.
bool AnyoneOwns(const std::string& directory);

#define MAVOEA_SKIP_UNLESS_ANYONE_OWNS(directory)                            \
    if (!AnyoneOwns(directory)) {                                            \
        GTEST_SKIP() << "files in " << directory << " cannot be given away"; \
    }

// Making EA directories takes the superuser.
#define MAVOEA_SKIP_UNLESS_ROOT()                                                         \
    if (::geteuid() != 0) {                                                               \
        GTEST_SKIP() << "making EA directories takes the superuser; run this test as it"; \
    }

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_TOOL_H_

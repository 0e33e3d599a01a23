#include "tests/tool/tool.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <iterator>
#include <sstream>

#include "tests/support/process.h"

template class nlohmann::basic_json<>;

void nlohmann::PrintTo(const json& value, std::ostream* out) { *out << value.dump(2); }

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

std::string Contents(const std::string& path) {
    const Bytes bytes = ReadFile(path);
    return {bytes.begin(), bytes.end()};
}

std::string FromEnvironment(const char* variable, const char* otherwise) {
    const char* const value = std::getenv(variable);
    return value != nullptr ? value : otherwise;
}

void Limit(decltype(RLIMIT_AS) what, std::size_t bytes) {
    const rlimit limit = {bytes, bytes};
    if (setrlimit(what, &limit) != 0) _exit(125);
}

TestedTool& TheTool() {
    static TestedTool tool = {
        FromEnvironment("MAVOEA_TOOL", MAVOEA_TOOL_PATH),
        FromEnvironment("MAVOEA_TOOL_EMULATOR", MAVOEA_EMULATOR),
        FromEnvironment("MAVOEA_TOOL_SANITIZERS", MAVOEA_TOOL_SANITIZERS),
    };
    return tool;
}

// A copy of the tool and of the libraries in the lib beside its bin, where everybody can enter and
// nobody else can write. It finds the libraries from where it is itself.
class CopyForEverybody {
 public:
    explicit CopyForEverybody(const std::string& tool) {
        const fs::path build = fs::path(tool).parent_path().parent_path();
        for (const std::string& directory : {dir_.path(), dir_ / "bin", dir_ / "lib"}) {
            mkdir(directory.c_str(), 0755);
            chmod(directory.c_str(), 0755);
        }
        Copy(tool, path());
        for (const auto& entry : fs::directory_iterator(build / "lib")) {
            const std::string name = entry.path().filename().string();
            if (name.find(".so.") != std::string::npos) Copy(entry.path(), dir_ / ("lib/" + name));
        }
    }

    std::string path() const { return dir_ / "bin/mavoea"; }

 private:
    static void Copy(const fs::path& from, const std::string& to) {
        fs::copy(from, to, fs::copy_options::copy_symlinks);
        if (!fs::is_symlink(from)) chmod(to.c_str(), 0755);
    }

    TempDir dir_;
};

// Other users need not be able to enter the directory of the build, and programs need not be
// allowed to run where temporary files are.
std::string LetOthersRunTheTool() {
    static const CopyForEverybody copy(TheTool().path);
    if (OthersReach(copy.path()).value_or(false)) TheTool().path = copy.path();
    return OthersReach(TheTool().path).value_or(false)
               ? std::string()
               : "other users can run the tool neither where it is nor where temporary files are";
}

[[maybe_unused]] const bool kOthersRunTheTool = [] {
    before_another_user = LetOthersRunTheTool;
    return true;
}();

}  // namespace

nlohmann::json ToolResult::json() const { return nlohmann::json::parse(out); }

void PrintTo(const ToolResult& result, std::ostream* out) {
    *out << "exit status " << result.status << "\nout: " << result.out << "\nerr: " << result.err;
}

const TestedTool& Tested() { return TheTool(); }

std::string TestedTool::Command() const {
    return emulator + (emulated() ? " " : "") + Quoted(path);
}

std::vector<int> Types(std::vector<int> all) {
    if (Tested().emulated()) std::erase_if(all, [](int type) { return type != 0 && type != 2; });
    return all;
}

ToolStart::ToolStart(const Arguments& arguments) {
    std::istringstream emulator(Tested().emulator);
    words_.assign(std::istream_iterator<std::string>(emulator), {});
    words_.push_back(Tested().path);
    words_.insert(words_.end(), arguments.begin(), arguments.end());
    for (std::string& word : words_) argv_.push_back(word.data());
    argv_.push_back(nullptr);
}

ToolResult RunTool(const Arguments& arguments, const std::string& input, Limits limits) {
    if (limits.user != 0) (void)LetOthersRunTheTool();
    // Files, not pipes: neither side can wait for the other.
    const TempDir dir;
    WriteFile(dir / "in", Ascii(input));
    ToolStart tool(arguments);
    const std::string in = dir / "in";
    const std::string out = dir / "out";
    const std::string err = dir / "err";
    const pid_t child = fork();
    if (child < 0) abort();
    if (child == 0) {
        const int fds[] = {open(in.c_str(), O_RDONLY), open(out.c_str(), O_WRONLY | O_CREAT, 0600),
                           open(err.c_str(), O_WRONLY | O_CREAT, 0600)};
        for (int i = 0; i < 3; ++i) {
            if (dup2(fds[i], i) != i) _exit(126);
        }
        if (limits.memory != 0 && !Tested().emulated() && !Tested().sanitized()) {
            Limit(RLIMIT_AS, limits.memory);
        }
        if (limits.file_size != 0) {
            signal(SIGXFSZ, SIG_IGN);  // the write fails instead
            Limit(RLIMIT_FSIZE, limits.file_size);
        }
        if (limits.open_files != 0) Limit(RLIMIT_NOFILE, limits.open_files);
        if (limits.user != 0 && !BecomeUser(limits.user, limits.user)) _exit(124);
        tool.Exec();
        _exit(127);
    }
    int status = 0;
    if (waitpid(child, &status, 0) != child) abort();
    ToolResult result;
    result.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    result.out = Contents(out);
    result.err = Contents(err);
    return result;
}

bool AnyoneOwns(const std::string& directory) {
    const TempDir given(directory);
    return chown(given.path().c_str(), 1234, 4321) == 0;
}

bool KeepsUserAttributes(const std::string& directory) {
    return setxattr(directory.c_str(), "user.mavoea.probe", "x", 1, 0) == 0 &&
           removexattr(directory.c_str(), "user.mavoea.probe") == 0;
}

}  // namespace mavoea::test

// Objects with metadata on two volumes, and the tool that carries them from one to the other.
#ifndef MAVOEA_TESTS_TOOL_TRAVEL_H_
#define MAVOEA_TESTS_TOOL_TRAVEL_H_

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "tests/support/process.h"
#include "tests/support/second_volume.h"
#include "tests/tool/tool.h"

namespace mavoea::test {

inline constexpr int kAppleDouble = 0;
inline constexpr int kEaDirectory = 1;
inline constexpr int kFileEa = 2;
inline constexpr int kXattr = 7;
inline constexpr int kSamba = 20;  // this number is the tests' own

// As --volume takes it.
inline std::string WordOfType(int type) { return type == kSamba ? "samba" : std::to_string(type); }

// The file systems of tests take no attributes of other name spaces for themselves.
inline bool KeepsFork(int type) { return type != kXattr; }

inline std::string Colour() { return "user.colour"; }
inline std::string FinderInfoDigits() {
    return "5445585474747874000000000000000000000000000000000000000000000001";
}

// Two directories, declared to be volumes, on one file system or on two.
class Travel {
 public:
    Travel(int from, int to) : Travel(from, to, std::string()) {}
    Travel(int from, int to, const std::string& elsewhere)
        : from_(from), to_(to), target_(elsewhere.empty() ? dir_ / "to" : elsewhere + "/to") {
        mkdir((dir_ / "from").c_str(), 0755);
        mkdir(target_.c_str(), 0755);
    }

    std::string From(const std::string& name) const { return dir_ / ("from/" + name); }
    std::string To(const std::string& name) const { return target_ + '/' + name; }

    Arguments WithVolumes(Arguments arguments) const {
        arguments.insert(arguments.begin(), {"--volume", dir_ / "from" + "=" + WordOfType(from_),
                                             "--volume", target_ + "=" + WordOfType(to_)});
        return arguments;
    }
    ToolResult Run(const Arguments& arguments, const std::string& input = {}) const {
        return RunTool(WithVolumes(arguments), input);
    }

    void MakeFile(const std::string& path, const std::string& data = "data") const {
        WriteFile(path, Ascii(data));
    }

    // A named attribute and, where volumes of both types keep them, Finder info and fork.
    void GiveMetadata(const std::string& path, const std::string& colour = "blue") const {
        ASSERT_EQ(0, Run({"set", path, Colour(), colour}).status) << path;
        if (!KeepsFork(from_) || !KeepsFork(to_)) return;
        ASSERT_EQ(0,
                  Run({"set", path, "com.apple.FinderInfo", "--hex", FinderInfoDigits()}).status);
        ASSERT_EQ(0, Run({"set", path, "com.apple.ResourceFork", "fork of " + colour}).status);
    }

    void ExpectMetadata(const std::string& path, const std::string& colour = "blue") const {
        EXPECT_EQ(colour, Run({"get", path, Colour()}).out) << path;
        if (!KeepsFork(from_) || !KeepsFork(to_)) return;
        std::string finder_info;
        for (const std::uint8_t c : Run({"get", path, "com.apple.FinderInfo"}).bytes()) {
            constexpr char kDigits[] = "0123456789abcdef";
            finder_info += kDigits[c >> 4];
            finder_info += kDigits[c & 15];
        }
        EXPECT_EQ(FinderInfoDigits(), finder_info) << path;
        EXPECT_EQ("fork of " + colour, Run({"get", path, "com.apple.ResourceFork"}).out) << path;
    }

    void ExpectNoMetadata(const std::string& path) const {
        EXPECT_EQ(1, Run({"get", path, Colour()}).status) << path;
        EXPECT_EQ(1, Run({"get", path, "com.apple.ResourceFork"}).status) << path;
    }

    const TempDir& dir() const { return dir_; }
    std::string source() const { return dir_ / "from"; }
    const std::string& target() const { return target_; }

    // What is not hidden of the objects: nothing of temporary files, nothing of metadata.
    static std::vector<std::string> ObjectsIn(const std::string& directory) {
        std::vector<std::string> names = NamesIn(directory);
        std::erase_if(names, [](const std::string& name) {
            return name == "@eaDir" || name.starts_with("._");
        });
        return names;
    }

 private:
    TempDir dir_;
    int from_;
    int to_;
    std::string target_;
};

inline std::string TextOf(const std::string& path) {
    const Bytes bytes = ReadFile(path);
    return {bytes.begin(), bytes.end()};
}

inline struct stat StatusOf(const std::string& path) {
    struct stat info = {};
    EXPECT_EQ(0, lstat(path.c_str(), &info)) << path;
    return info;
}

// Names that go wrong where somebody builds a command line, a path or a line of text from them.
inline std::vector<std::string> DifficultNames() {
    return {"two words",     "it's",         "new\nline", "na\xC3\xAFve",
            "no \xFF utf-8", "$(x) `y` \\z", "-dash",     std::string(203, 'n')};
}

// The tool as a process that has not ended, with its questions to be answered.
class RunningTool {
 public:
    // What it writes to standard output is lost, or comes with what it says.
    enum class Output { kLost, kSaid };
    explicit RunningTool(const Arguments& arguments, Output output = Output::kLost) {
        int in[2];
        int err[2];
        if (pipe(in) != 0 || pipe(err) != 0) abort();
        ToolStart tool(arguments);
        child_ = fork();
        if (child_ < 0) abort();
        if (child_ == 0) {
            alarm(60);
            dup2(in[0], 0);
            dup2(output == Output::kSaid ? err[1] : open("/dev/null", O_WRONLY), 1);
            dup2(err[1], 2);
            for (const int fd : {in[0], in[1], err[0], err[1]}) close(fd);
            tool.Exec();
            _exit(127);
        }
        close(in[0]);
        close(err[1]);
        in_ = in[1];
        err_ = err[0];
    }
    ~RunningTool() {
        EndInput();
        close(err_);
    }
    RunningTool(const RunningTool&) = delete;
    RunningTool& operator=(const RunningTool&) = delete;

    // Reads what it says until that is part of it. False when it ends before.
    bool WaitFor(const std::string& text) {
        char c = 0;
        while (said_.find(text) == std::string::npos) {
            if (read(err_, &c, 1) != 1) return false;
            said_ += c;
        }
        said_.clear();
        return true;
    }
    void Answer(const std::string& text) const {
        EXPECT_EQ(static_cast<ssize_t>(text.size()), write(in_, text.data(), text.size()));
    }
    void EndInput() {
        if (in_ >= 0) close(in_);
        in_ = -1;
    }
    void Signal(int number) const { kill(child_, number); }

    // The exit status; what else it says is in said().
    int Wait() {
        char c = 0;
        while (read(err_, &c, 1) == 1) said_ += c;
        int status = 0;
        if (waitpid(child_, &status, 0) != child_) abort();
        return WIFEXITED(status) ? WEXITSTATUS(status) : 1000 + WTERMSIG(status);
    }
    const std::string& said() const { return said_; }

 private:
    pid_t child_;
    int in_;
    int err_;
    std::string said_;
};

#define MAVOEA_SKIP_WITHOUT_SECOND(volume)                                              \
    if (!(volume).ok()) {                                                               \
        GTEST_SKIP() << "no second file system: needs the right to mount, or /dev/shm"; \
    }

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_TRAVEL_H_

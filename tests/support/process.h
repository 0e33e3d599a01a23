// The process around a test: other users, other programs, open descriptors.
#ifndef MAVOEA_TESTS_SUPPORT_PROCESS_H_
#define MAVOEA_TESTS_SUPPORT_PROCESS_H_

#include <errno.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <functional>
#include <iterator>
#include <optional>
#include <string>

namespace mavoea::test {

inline bool RunsAsRoot() { return ::geteuid() == 0; }

// Whether the child of AsUser() can go back to uid 0.
enum class Root { kSaved, kGivenUp };

// The real, effective and saved user and group of this process; from here on it has no other
// groups.
inline bool BecomeUser(uid_t id, uid_t saved) {
    return setgroups(0, nullptr) == 0 && setresgid(id, id, id) == 0 &&
           setresuid(id, id, saved) == 0;
}

// What is called before another user is to reach something, which may have to be put where it can;
// returns why it cannot, or nothing.
inline std::function<std::string()> before_another_user;

// Runs `body` in a child process whose real and effective uid and gid are `id`. Expectations that
// fail in it are printed there and fail the test here. For tests that run as root.
inline void AsUser(uid_t id, Root root, const std::function<void()>& body) {
    if (before_another_user) before_another_user();
    fflush(nullptr);
    const pid_t child = fork();
    ASSERT_LE(0, child) << strerror(errno);
    if (child == 0) {
        if (!BecomeUser(id, root == Root::kSaved ? 0 : id)) {
            fprintf(stderr, "cannot become user %u: %s\n", id, strerror(errno));
            _exit(2);
        }
        body();
        fflush(nullptr);
        _exit(::testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    ASSERT_EQ(child, waitpid(child, &status, 0)) << strerror(errno);
    EXPECT_EQ(0, status) << "wait status of the child that was user " << id;
}

// Whether another user may enter a directory, or run a program; nothing where this process cannot
// become another user. For tests that run as root.
inline std::optional<bool> OthersReach(const std::string& path) {
    const pid_t child = fork();
    if (child == 0) {
        if (!BecomeUser(65534, 65534)) _exit(2);
        _exit(access(path.c_str(), X_OK) == 0 ? 0 : 1);
    }
    int status = 0;
    if (child < 0 || waitpid(child, &status, 0) != child || !WIFEXITED(status) ||
        WEXITSTATUS(status) > 1) {
        return std::nullopt;
    }
    return WEXITSTATUS(status) == 0;
}

// Why AsUser() can show nothing here; empty when it can.
inline std::string WhyNoOtherUsers() {
    if (!RunsAsRoot()) return "takes the superuser, to become another user";
    const std::string directory = std::filesystem::temp_directory_path().string();
    const std::optional<bool> reached = OthersReach(directory);
    if (!reached) return "this process may not become another user";
    if (!*reached) return "other users cannot enter " + directory + ", where temporary files are";
    return before_another_user ? before_another_user() : std::string();
}

#define MAVOEA_SKIP_WITHOUT_OTHER_USERS()                                          \
    if (const std::string why = ::mavoea::test::WhyNoOtherUsers(); !why.empty()) { \
        GTEST_SKIP() << why;                                                       \
    }

// Runs `body` in a child process that is killed if it waits for what never comes. Expectations that
// fail in it are printed there and fail the test here.
inline void WithoutWaiting(const std::function<void()>& body) {
    fflush(nullptr);
    const pid_t child = fork();
    ASSERT_LE(0, child) << strerror(errno);
    if (child == 0) {
        alarm(10);
        body();
        fflush(nullptr);
        _exit(::testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    ASSERT_EQ(child, waitpid(child, &status, 0)) << strerror(errno);
    EXPECT_EQ(0, status) << (WIFSIGNALED(status) && WTERMSIG(status) == SIGALRM
                                 ? "it waited until it was killed"
                                 : "wait status of the child");
}

inline long OpenDescriptors() {
    const std::filesystem::directory_iterator all("/proc/self/fd");
    return std::distance(begin(all), end(all));
}

// Sets the umask until the end of its scope.
class Umask {
 public:
    explicit Umask(mode_t mask) : former_(::umask(mask)) {}
    ~Umask() { ::umask(former_); }
    Umask(const Umask&) = delete;
    Umask& operator=(const Umask&) = delete;

 private:
    mode_t former_;
};

// Runs a shell command; returns what it wrote to standard output, and its exit status (-1 when
// there is none).
struct ProgramResult {
    std::string output;
    int status = -1;
};

inline ProgramResult RunProgram(const std::string& command) {
    ProgramResult result;
    FILE* const pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) return result;
    char part[4096];
    for (size_t size = 0; (size = fread(part, 1, sizeof part, pipe)) > 0;) {
        result.output.append(part, size);
    }
    const int status = pclose(pipe);
    if (WIFEXITED(status)) result.status = WEXITSTATUS(status);
    return result;
}

// A word of a shell's command line.
inline std::string Quoted(const std::string& word) {
    std::string quoted = "'";
    for (const char c : word) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return quoted + "'";
}

inline bool HasProgram(const std::string& name) {
    return RunProgram("command -v " + name + " 2>/dev/null").status == 0;
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_PROCESS_H_

// Runs an operation in a process of its own that dies before a chosen one of its system calls.
#ifndef MAVOEA_TESTS_CRASH_CRASH_RUN_H_
#define MAVOEA_TESTS_CRASH_CRASH_RUN_H_

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <string>
#include <vector>

#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"

namespace mavoea::test {

// Runs a program, without a shell and without its complaints: its exit status, -1 when there is
// none.
inline int RunCommand(std::vector<std::string> argv) {
    std::vector<char*> pointers;
    for (std::string& argument : argv) pointers.push_back(argument.data());
    pointers.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
    pid_t child = 0;
    const int failed =
        posix_spawn(&child, pointers[0], &actions, nullptr, pointers.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (failed != 0) return -1;
    int status = 0;
    if (waitpid(child, &status, 0) != child) return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

class CrashRun {
 public:
    CrashRun() {
        void* const page = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE,
                                MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        if (page == MAP_FAILED) abort();
        shared_ = static_cast<Shared*>(page);
    }
    ~CrashRun() { munmap(shared_, sizeof(Shared)); }
    CrashRun(const CrashRun&) = delete;
    CrashRun& operator=(const CrashRun&) = delete;

    // Runs `body`, dead before its nth call (from 1), or behind the last when it makes fewer. What
    // an external command is called by, "/bin/cp", is the name of a call too.
    void DieBefore(int nth, const std::function<int()>& body) {
        RunInChild(body, [this, nth](const std::string& name) {
            if (++shared_->calls == nth) Die();
            Note(name);
        });
    }

    // Runs `body`, dead in the middle of its nth "pwrite" (from 1), of which `bytes` bytes are on
    // their way. False, and nothing has died, when it writes less often than that.
    void DieWithin(int nth, std::size_t bytes, const std::function<int()>& body) {
        RunInChild(
            [&] {
                const ShortCall half("pwrite", nth, bytes);
                return body();
            },
            [this, nth](const std::string& name) {
                if (shared_->writes == nth) Die();
                if (name == "pwrite") ++shared_->writes;
                ++shared_->calls;
                Note(name);
            });
    }

    bool finished() const { return shared_->finished; }
    int result() const { return shared_->result; }      // of a body that finished
    int calls() const { return shared_->calls; }        // made, the one that was not made included
    int writes() const { return shared_->writes; }      // of DieWithin()
    std::string last() const { return shared_->last; }  // the name of the last call made

 private:
    struct Shared {
        bool finished;
        int result;
        int calls;
        int writes;
        char last[64];
    };

    [[noreturn]] static void Die() {
        (void)kill(getpid(), SIGKILL);
        _exit(99);
    }

    void Note(const std::string& name) {
        const std::size_t size = std::min(name.size(), sizeof shared_->last - 1);
        memcpy(shared_->last, name.data(), size);
        shared_->last[size] = '\0';
    }

    void RunInChild(const std::function<int()>& body,
                    const std::function<void(const std::string&)>& before) {
        memset(shared_, 0, sizeof *shared_);
        fflush(nullptr);
        const pid_t child = fork();
        ASSERT_LE(0, child) << strerror(errno);
        if (child == 0) {
            Hooks().before = before;
            Platform().exec = [&](const std::vector<std::string>& argv) {
                before(argv[0]);
                return RunCommand(argv);
            };
            shared_->result = body();
            shared_->finished = true;
            Die();
        }
        int status = 0;
        ASSERT_EQ(child, waitpid(child, &status, 0)) << strerror(errno);
        ASSERT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL)
            << "wait status " << status << " behind " << last();
    }

    Shared* shared_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_CRASH_CRASH_RUN_H_

// Runs a program and waits for it, without touching the caller's signals: no disposition is
// changed, no signal blocked, and no other child waited for. (system() ignores SIGINT and SIGQUIT
// and blocks SIGCHLD for the whole process meanwhile, which a threaded daemon cannot have.)
//
// The child gets what exec() hands on: the caller's signal mask, the signals it ignores, and its
// descriptors that are not close-on-exec.

#include <errno.h>
#include <spawn.h>
#include <stdarg.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstddef>

#include "platform/include/mavocore.h"

namespace {

// Results that are no exit status. A signal's number is counted down from kKilled, so that none is
// taken for one of the other two.
constexpr int kNotRun = -1;
constexpr int kStatusLost = -2;
constexpr int kKilled = -128;

// Waits for that child alone. What MLIBCExec() returns.
int ExitStatusOf(pid_t child) {
    int status = 0;
    while (waitpid(child, &status, 0) < 0) {
        if (errno == EINTR) continue;
        // A process that ignores SIGCHLD has its children reaped by the kernel: the wait has ended
        // with the child, but its status is gone. So it is when a handler waits for any child.
        return kStatusLost;
    }
    if (WIFSIGNALED(status)) return kKilled - WTERMSIG(status);
    return WEXITSTATUS(status);
}

}  // namespace

int MLIBCExec(const char* szProgram, ...) {
    if (szProgram == nullptr) {
        errno = EINVAL;
        return kNotRun;
    }

    std::size_t count = 1;
    va_list arguments;
    va_start(arguments, szProgram);
    while (va_arg(arguments, char*) != nullptr) ++count;
    va_end(arguments);

    auto** const argv = static_cast<char**>(reallocarray(nullptr, count + 1, sizeof(char*)));
    if (argv == nullptr) return kNotRun;
    argv[0] = const_cast<char*>(szProgram);  // argv's type only: nobody writes to the strings.
    va_start(arguments, szProgram);
    for (std::size_t i = 1; i <= count; ++i) argv[i] = va_arg(arguments, char*);
    va_end(arguments);

    pid_t child = -1;
    const int error = posix_spawn(&child, szProgram, nullptr, nullptr, argv, environ);
    free(argv);
    if (error != 0) {
        errno = error;
        return kNotRun;
    }
    return ExitStatusOf(child);
}

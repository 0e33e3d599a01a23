// The system calls that a piece of code makes, seen by the kernel: ptrace of a child process.
#ifndef MAVOEA_TESTS_SYSCALLS_TRACED_H_
#define MAVOEA_TESTS_SYSCALLS_TRACED_H_

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace mavoea::test {

struct Trace {
    std::vector<std::string> calls;  // their names, in order
    bool succeeded = false;          // what the traced code returned
};

// Runs `code` in a child process, first once to warm up heap and caches, then once traced. Nothing
// where the kernel does not let processes trace their children; `*why_not` then says why.
std::optional<Trace> TraceCalls(const std::function<bool()>& code, std::string* why_not);

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SYSCALLS_TRACED_H_

// The tool on a terminal.
#ifndef MAVOEA_TESTS_TOOL_TERMINAL_H_
#define MAVOEA_TESTS_TOOL_TERMINAL_H_

#include <pty.h>
#include <sys/wait.h>
#include <unistd.h>

#include <string>

#include "tests/tool/tool.h"

namespace mavoea::test {

// What a run has shown there, lines ended by "\r\n", and its exit status: -1 where there are no
// terminals.
struct Shown {
    std::string text;
    int status = -1;
};

inline Shown RunOnTerminal(const Arguments& arguments) {
    ToolStart tool(arguments);
    Shown shown;
    int terminal = -1;
    const pid_t child = forkpty(&terminal, nullptr, nullptr, nullptr);
    if (child < 0) return shown;
    if (child == 0) {
        tool.Exec();
        _exit(127);
    }
    char part[1024];
    for (ssize_t size; (size = read(terminal, part, sizeof part)) > 0;) {
        shown.text.append(part, static_cast<std::size_t>(size));
    }
    int status = 0;
    waitpid(child, &status, 0);
    close(terminal);
    if (WIFEXITED(status)) shown.status = WEXITSTATUS(status);
    return shown;
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_TERMINAL_H_

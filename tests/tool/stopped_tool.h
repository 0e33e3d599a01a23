// The tool under the kernel's eye: stopped before each of its calls on files, where a test looks at
// what there is by then, or changes it.
#ifndef MAVOEA_TESTS_TOOL_STOPPED_TOOL_H_
#define MAVOEA_TESTS_TOOL_STOPPED_TOOL_H_

#include <gtest/gtest.h>
#include <sys/types.h>

#include <functional>
#include <ostream>
#include <string>
#include <vector>

#include "tests/tool/tool.h"

namespace mavoea::test {

// A system call that names a file or changes an open one, by the tool or a program that it runs. It
// has not been made yet.
struct FileCall {
    // What it looks up: all names of `path` that are not in `from`, a directory that is open or the
    // root. Both are absolute, links as they are.
    struct LookUp {
        std::string path;
        std::string from;
    };

    int nth = 0;       // from 1
    std::string name;  // "openat"
    std::vector<LookUp> look_ups;
    std::string open_file;   // what its descriptor leads to, where it looks up no name
    std::string descriptor;  // a path that leads to the same, also where that has no name
    pid_t process = 0;       // that makes it

    // Whether what the name `path` stands for matters to it: it looks that up, or passes through
    // it, or lists the directory that has it.
    bool Sees(const std::string& path) const;
    // Whether it tells what is there, and nothing is done with that.
    bool OnlyLooks() const;
    // The files in the directory `tree` that the process has open and that have no name, or none
    // any more: paths that lead to them.
    std::vector<std::string> FilesWithoutNames(const std::string& tree) const;
    // Whether it has what was written put on disk.
    bool Syncs() const;
    // Whether it may change what is there. Those that open files, and may make them, do not count.
    bool Changes() const;
};
void PrintTo(const FileCall& call, std::ostream* out);

// What is done before a call; false when no further call matters.
using AtCall = std::function<bool(const FileCall& call)>;

struct StoppedRun : ToolResult {
    int calls = 0;  // how many there were, up to the last that mattered
};

// Where a run stops: at calls with names and attributes, or also where data is read and written at
// an offset, or data and syncs, or data and locks.
enum class Stops { kAtNames, kAtDataToo, kAtSyncsToo, kAtLocksToo };

// Runs the tool and calls `at_call` before each of its file calls, counted from the first that
// names a file in the directory `tree`. All of the tool stands still meanwhile. No other child of
// this process may end while it runs.
StoppedRun RunStopped(const Arguments& arguments, const std::string& tree, const AtCall& at_call,
                      Stops stops = Stops::kAtNames);

// The same, with `attack` before the nth call only. It has not come to that when the run made
// fewer.
StoppedRun RunStoppedAt(const Arguments& arguments, const std::string& tree, int nth,
                        const std::function<void()>& attack);

// The same, but the tool is killed before its nth call that Changes() something. There was no such
// call when the run ended by itself.
StoppedRun RunKilledAt(const Arguments& arguments, const std::string& tree, int nth);

// Why processes cannot be stopped at their calls here; empty where they can.
std::string WhyNotStopped();

#define MAVOEA_SKIP_UNLESS_STOPPED()                                                     \
    if (const std::string why_not = ::mavoea::test::WhyNotStopped(); !why_not.empty()) { \
        GTEST_SKIP() << "the tool cannot be stopped at its calls: " << why_not;          \
    }

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_STOPPED_TOOL_H_

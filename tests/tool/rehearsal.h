// Two volumes, and dry runs of the tool on them, each followed by the run that it is of.
#ifndef MAVOEA_TESTS_TOOL_REHEARSAL_H_
#define MAVOEA_TESTS_TOOL_REHEARSAL_H_

#include <linux/fs.h>
#include <sys/ioctl.h>

#include <optional>
#include <set>
#include <string>

#include "tests/support/object_files.h"
#include "tests/support/snapshot.h"
#include "tests/tool/travel.h"

namespace mavoea::test {

class Rehearsal {
 public:
    // "to" is below `elsewhere`, where that is not empty.
    Rehearsal(int from, int to, const std::string& elsewhere = {}) : travel_(from, to, elsewhere) {}

    std::string From(const std::string& name) const { return travel_.From(name); }
    std::string To(const std::string& name) const { return travel_.To(name); }
    const Travel& travel() const { return travel_; }

    // What both say; nothing has changed when the real run comes. Its questions get `answers`, and
    // are not what the dry run says.
    ToolResult Expect(const Arguments& arguments, const std::string& answers = {}) const {
        SCOPED_TRACE(::testing::PrintToString(arguments));
        const ToolResult said = Look(arguments);
        const ToolResult done = Do(arguments, {}, answers);
        EXPECT_EQ(done.out, said.out);
        if (answers.empty()) {
            EXPECT_EQ(done.err, said.err);
        }
        EXPECT_EQ(done.status, said.status);
        return said;
    }
    std::string Lines(const Arguments& arguments) const { return Expect(arguments).out; }

    // The same by another user.
    ToolResult ExpectOf(uid_t user, const Arguments& arguments) const {
        SCOPED_TRACE(::testing::PrintToString(arguments));
        const ToolResult said = Look(arguments, {.user = user});
        const ToolResult done = Do(arguments, {.user = user});
        EXPECT_EQ(done.out, said.out);
        EXPECT_EQ(done.err, said.err);
        EXPECT_EQ(done.status, said.status);
        return said;
    }

    // The dry run alone.
    ToolResult Look(Arguments arguments, Limits limits = {}) const {
        arguments.insert(arguments.begin() + 1, "--dry-run");
        if (!keeps_times) {
            SetOldTimes(travel_.source());
            SetOldTimes(travel_.target());
        }
        const Snapshot from = TakeSnapshot(travel_.source());
        const Snapshot to = TakeSnapshot(travel_.target());
        const ToolResult said = RunTool(travel_.WithVolumes(arguments), {}, limits);
        // Access times stay where the user may have that.
        std::set<std::string> ignored;
        if (limits.user != 0) ignored.insert("atime");
        EXPECT_THAT(Differences(from, TakeSnapshot(travel_.source()), ignored),
                    ::testing::IsEmpty());
        EXPECT_THAT(Differences(to, TakeSnapshot(travel_.target()), ignored), ::testing::IsEmpty());
        return said;
    }

    // The real run alone.
    ToolResult Do(Arguments arguments, Limits limits = {}, const std::string& answers = {}) const {
        arguments.insert(arguments.begin() + 1, "--verbose");
        return RunTool(travel_.WithVolumes(arguments), answers, limits);
    }

    bool keeps_times = false;  // which nobody may set, or has looked at

 private:
    Travel travel_;
};

// The line of a copy.
inline std::string Arrow(const std::string& from, const std::string& to) {
    return "'" + from + "' -> '" + to + "'\n";
}

// An inode that nobody may change, until the end of its scope.
class Immutable {
 public:
    explicit Immutable(const std::string& path) : fd_(open(path.c_str(), O_RDONLY | O_CLOEXEC)) {
        ok_ = Set(FS_IMMUTABLE_FL);
    }
    ~Immutable() {
        (void)Set(0);
        close(fd_);
    }
    Immutable(const Immutable&) = delete;
    Immutable& operator=(const Immutable&) = delete;
    bool ok() const { return ok_; }

 private:
    bool Set(int flags) const { return ioctl(fd_, FS_IOC_SETFLAGS, &flags) == 0; }

    int fd_;
    bool ok_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_REHEARSAL_H_

// Every call that fails while named attributes and the resource fork behind one of them are listed,
// read, set and removed.

#include <errno.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <deque>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fault_sweep.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

// Nothing is recorded of the attribute calls: their errno tells.
const Outcome kErrnoTells = {.result = -1, .error = kInjectedErrno};

// ---- Attributes ----

// One attribute, "user.a", whose value is w.text, and two names in the list.
void MakeAttributes(FaultWorld& w) {
    WriteFile(w / "a", Ascii("data"));
    w.text = "value";
    Hooks().listxattr = [](const char*, char* names, size_t size) -> ssize_t {
        constexpr char kNames[] = "user.a\0user.b";
        if (size == 0) return sizeof kNames;
        memcpy(names, kNames, std::min(size, sizeof kNames));
        return sizeof kNames;
    };
    Hooks().getxattr = [&w](const char*, const char*, void* value, size_t size) -> ssize_t {
        memcpy(value, w.text.data(), std::min(size, w.text.size()));
        return static_cast<ssize_t>(w.text.size());
    };
    Hooks().setxattr = [&w](const char*, const char*, const void* value, size_t size, int) {
        w.text = std::string(static_cast<const char*>(value), size);
        return 0;
    };
    Hooks().removexattr = [&w](const char*, const char*) {
        w.text.clear();
        return 0;
    };
}

FaultCase OnAttributes(const char* name, std::function<long long(FaultWorld&)> run) {
    return {
        .name = name, .prepare = MakeAttributes, .run = std::move(run), .state = [](FaultWorld& w) {
            return w.text;
        }};
}

TEST(AttributeFaults, NamesAreListedOrTheFailureIsRecorded) {
    FaultCase c = OnAttributes("list extended attributes", [](FaultWorld& w) {
        return MAVOEAXattrEnum((w / "a").c_str(), &w.list);
    });
    c.prepare = [](FaultWorld& w) {
        MakeAttributes(w);
        w.list = NewList({"before"});
    };
    c.finish = [](FaultWorld& w) { MLIBCSzListFree(w.list); };
    c.check = [](FaultWorld& w, const FaultRun& run) {
        std::vector<std::string> names = {"before", "user.a", "user.b"};
        if (run.expected == nullptr) return;
        if (run.result != 0) names.resize(run.call.ends_with("(user.b)") ? 2 : 1);
        if (run.result == 0 && !run.call.empty()) names.clear();
        EXPECT_EQ(names, Strings(w.list));
    };
    const ExpectedRecord not_listed = {0x2A00, "ea_xattr_enum"};
    const Outcome recorded = {.result = -1, .records = {not_listed}, .error = kInjectedErrno};
    c.rules = {// No file and no attributes are no names, and the list is emptied.
               {.call = "listxattr", .ordinal = 1, .errors = {ENOENT, ENODATA}},
               {.call = "listxattr", .outcome = recorded},
               {.call = "malloc", .outcome = {.result = -1, .records = {{0x100, "ea_xattr_enum"}}}},
               // What has been pushed before stays.
               {.call = "MLIBCSzListPush", .outcome = {.result = -1}}};
    SweepFaults(c);
}

TEST(AttributeFaults, AValueIsReadOrErrnoTells) {
    FaultCase c = OnAttributes("get an attribute", [](FaultWorld& w) {
        w.buffer.resize(100);
        return MAVOEAXattrGet((w / "a").c_str(), "user.a", w.buffer.data(), 100);
    });
    c.clean = {.result = 5};
    c.rules = {{.call = "getxattr", .outcome = kErrnoTells}};
    SweepFaults(c);
}

TEST(AttributeFaults, AValueIsSetOrErrnoTells) {
    FaultCase c = OnAttributes("set an attribute", [](FaultWorld& w) {
        return MAVOEAXattrSet((w / "a").c_str(), "user.a", "other", 5, 0);
    });
    c.rules = {{.call = "setxattr", .outcome = kErrnoTells}};
    SweepFaults(c);
}

TEST(AttributeFaults, AnAttributeIsRemovedOrErrnoTells) {
    FaultCase c = OnAttributes("remove an attribute", [](FaultWorld& w) {
        return MAVOEAXattrRemove((w / "a").c_str(), "user.a");
    });
    c.rules = {{.call = "removexattr", .outcome = kErrnoTells}};
    SweepFaults(c);
}

// ---- The resource fork ----

constexpr char kForkName[] = "com.apple.ResourceFork";
constexpr char kObject[] = "a";
constexpr char kFork[] = "fork";  // stands in for the view beneath the object

// An object of mode 0644 and its fork, on a volume that offers it as "a/rsrc"; as a user who may
// become the superuser.
void MakeFork(FaultWorld& w, size_t size) {
    WriteFile(w / kObject, Ascii("data"));
    ASSERT_EQ(0, ::chmod((w / kObject).c_str(), 0644));
    WriteFile(w / kFork, Pattern(size));
    const std::string view = w / "a/rsrc";
    const std::string fork = w / kFork;
    Hooks().stat = [=](const char* path, struct stat* info) {
        return ::stat(path == view ? fork.c_str() : path, info);
    };
    Hooks().fopen = [=](const char* path, const char* mode) {
        return ::fopen(path == view ? fork.c_str() : path, mode);
    };
    w.number = 1000;
    Hooks().geteuid = [&w] { return static_cast<uid_t>(w.number); };
    Hooks().seteuid = [&w](uid_t uid) {
        w.number = static_cast<int>(uid);
        return 0;
    };
}

FaultCase OnFork(const char* name, size_t size, std::function<long long(FaultWorld&)> run) {
    return {.name = name,
            .prepare = [size](FaultWorld& w) { MakeFork(w, size); },
            .run = std::move(run),
            .state = [](FaultWorld& w) { return std::to_string(w.number); }};
}

// A line of `unit`; outcomes hold pointers, so it is there for good.
const char* Line(const std::string& unit, const char* what) {
    static std::deque<std::string>& lines = *new std::deque<std::string>;
    return lines.emplace_back(unit + ":LINE Fail to " + what).c_str();
}

// Of the frame around the operation, which gives and takes back the right to look at the fork: only
// logged.
Rules Frame(const char* unit, long long result) {
    const auto logged = [&](const char* what) {
        return Outcome{.result = result, .log = {Line(unit, what)}, .files = Files::kDone};
    };
    Outcome not_back = logged("chmod. {error}");
    not_back.torn = {kObject};
    not_back.free = {kObject};
    Outcome still_root = logged("seteuid() back. {error}");
    still_root.torn = {"(state)"};
    return {{.call = "seteuid", .with = "(0)", .outcome = logged("seteuid(0). {error}")},
            {.call = "seteuid", .with = "(1000)", .outcome = still_root},
            {.call = "chmod", .with = ", 0744", .outcome = logged("chmod. {error}")},
            {.call = "chmod", .with = ", 0644", .outcome = not_back}};
}

TEST(ForkFaults, AForkIsReadOrTheCauseLogged) {
    const char* const unit = "ea_xattr_get";
    FaultCase c = OnFork("get the resource fork", 300, [](FaultWorld& w) {
        w.buffer.resize(300);
        return MAVOEAXattrGet((w / kObject).c_str(), kForkName, w.buffer.data(), 300);
    });
    c.clean = {.result = 300};
    c.check = [](FaultWorld& w, const FaultRun& run) {
        EXPECT_TRUE(run.result != 300 || w.buffer == Pattern(300));
    };
    const auto logged = [&](const char* what, int error) {
        return Outcome{.result = -1, .log = {Line(unit, what)}, .error = error};
    };
    const char* const read_nothing = "read({dir}/a/rsrc). Input/output error";
    c.rules =
        Frame(unit, 300) +
        Rules{
            {.call = "stat",
             .with = "{dir}/a)",
             .errors = {ENOENT},
             .outcome = {.result = -1, .records = {{0x700, unit}}, .error = ENOENT}},
            {.call = "stat",
             .with = "{dir}/a)",
             .outcome = {.result = -1, .records = {{0x2700, unit}}, .error = kInjectedErrno}},
            {.call = "stat",
             .with = "{dir}/a/rsrc)",
             .errors = {ENOENT},
             .outcome = {.result = -1, .error = ENOENT}},
            {.call = "stat",
             .with = "{dir}/a/rsrc)",
             .outcome = logged("stat({dir}/a/rsrc). {error}", kInjectedErrno)},
            {.call = "fopen", .outcome = logged("open({dir}/a/rsrc). {error}", kInjectedErrno)},
            {.call = "fread",
             .errors = {EIO},
             .outcome = logged("read({dir}/a/rsrc). {error}", kInjectedErrno)},
            {.call = "fread", .outcome = logged(read_nothing, EIO)},
            // All has been read by then.
            {.call = "fclose", .outcome = {.result = 300, .files = Files::kDone}},
        };
    SweepFaults(c);
}

// What Set and Remove have in common: their looks at the object and at its fork.
Rules Looks(const char* unit) {
    return {{.call = "stat",
             .with = "{dir}/a)",
             .outcome = {.result = -1,
                         .log = {Line(unit, "stat({dir}/a). {error}")},
                         .error = kInjectedErrno}},
            {.call = "stat",
             .with = "{dir}/a/rsrc)",
             .outcome = {.result = -1,
                         .log = {Line(unit, "stat({dir}/a/rsrc). {error}")},
                         .error = kInjectedErrno}},
            {.call = "fopen",
             .outcome = {.result = -1,
                         .log = {Line(unit, "open({dir}/a/rsrc). {error}")},
                         .error = kInjectedErrno}}};
}

TEST(ForkFaults, AForkIsWrittenOrTheCauseLogged) {
    const char* const unit = "ea_xattr_set";
    FaultCase c = OnFork("set the resource fork", 300, [](FaultWorld& w) {
        const Bytes value = Pattern(20'000, 1);
        return MAVOEAXattrSet((w / kObject).c_str(), kForkName, value.data(), 20'000, 0);
    });
    const Outcome not_written = {.result = -1,
                                 .log = {Line(unit, "write({dir}/a/rsrc). {error}")},
                                 .error = kInjectedErrno,
                                 .torn = {kFork}};
    Outcome short_write = not_written;
    short_write.log = {};
    short_write.any_log = true;  // one line, whose cause is whatever errno was
    short_write.error = kAnyErrno;
    c.rules = Frame(unit, 0) + Looks(unit) +
              Rules{{.call = "fwrite", .errors = {EIO, ENOSPC}, .outcome = not_written},
                    {.call = "fwrite", .outcome = short_write},
                    {.call = "fclose", .outcome = not_written}};
    SweepFaults(c);
}

TEST(ForkFaults, AForkIsEmptiedOrTheCauseLogged) {
    const char* const unit = "ea_xattr_remove";
    FaultCase c = OnFork("remove the resource fork", 300, [](FaultWorld& w) {
        return MAVOEAXattrRemove((w / kObject).c_str(), kForkName);
    });
    c.rules = Frame(unit, 0) + Looks(unit) +
              // Nothing was written that a close could lose.
              Rules{{.call = "fclose", .outcome = {.files = Files::kDone}}};
    SweepFaults(c);
}

}  // namespace
}  // namespace mavoea::test

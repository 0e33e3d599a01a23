// Fails every call that an exported function makes, one after the other, and holds what comes of it
// against a table.
//
// A FaultCase prepares a folder, runs one function and says what a plain run gives. SweepFaults()
// runs it once as it is and notes every call that can fail: kernel calls and allocations (the names
// of kernel_control.h) and the platform's ("MLIBCExec", "MLIBCSzListPush", ...). Then it runs it
// afresh for each of those calls and each error that the call can plausibly have, and for reads and
// writes with each way of coming back short. The first rule that names the call says what is to
// come of it (that room cannot be reserved needs none: all goes on); a failure without a rule, and
// a rule that no failure needs, are errors themselves.
//
// Whatever the rule, after each run: no block of memory is left, no descriptor, no change of
// effective uid, current directory or umask, and in the folder nothing but what the rule says.
// Afterwards pairs of calls fail: nothing is leaked then either, and no failure becomes a success.
#ifndef MAVOEA_TESTS_SUPPORT_FAULT_SWEEP_H_
#define MAVOEA_TESTS_SUPPORT_FAULT_SWEEP_H_

#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

// What a run works on. Made anew for each run, with an empty folder on a fast filesystem; the
// kernel and platform stand-ins are reset, and fsync() and sync() do nothing but be counted.
struct FaultWorld {
    std::string dir;  // the folder, a whole path
    std::string operator/(std::string_view name) const { return dir + "/" + std::string(name); }

    // For the case's use between prepare, run and finish.
    int fd = -1;
    int other_fd = -1;
    EASHandle* handle = nullptr;
    EASHandle* other_handle = nullptr;
    MLIBCSzList* list = nullptr;
    Bytes buffer;
    std::string text;
    int number = 0;
    std::shared_ptr<void> own;  // anything else; released after `finish`
};

// What fails, in a rule's list and in FaultRun: an errno, or one of these.
enum FaultKind : int {
    kShort = 1000,      // in rules: any transfer that comes back short
    kShortOnce = 1001,  // this one call moves less than asked, but something; the next are whole
    kShortThenNone = 1002,  // this one moves less than asked, and later ones of its name nothing
    kNoneOnce = 1003,       // this one call moves nothing, the next are whole
    kNone = 1004,           // this one and all later ones of its name move nothing
    kAnswer = 1005,         // a platform call answers -1 (NULL), without having done anything
    kExitStatus = 1006,     // MLIBCExec: the program, without having done anything, exits with 1
};

// What the folder is to hold afterwards: names, kinds, modes, contents, extended attributes.
enum class Files {
    kKept,      // as before the run
    kDone,      // as after a run in which nothing failed
    kEither,    // the whole folder one or the other
    kEach,      // each file by itself one or the other
    kAnything,  // not looked at: for checks of the case's own
};

struct ExpectedRecord {
    int code = 0;
    const char* unit = "";
};

inline constexpr int kAnyErrno = -1;       // not looked at
inline constexpr int kInjectedErrno = -2;  // that of the call that failed

// What is to come of a run. In texts "{dir}" stands for the folder and "{error}" for strerror() of
// the errno that the call failed with.
struct Outcome {
    long long result = 0;
    std::vector<ExpectedRecord> records = {};  // exactly these, oldest first
    std::vector<const char*> log = {};         // exactly these whole lines, line numbers as "LINE"
    int error = kAnyErrno;                     // errno afterwards

    // Names below are relative to the folder.
    Files files = Files::kKept;
    std::vector<const char*> made = {};  // there whatever `files` says; contents and mode free
    std::vector<const char*> gone = {};  // not there whatever `files` says
    std::vector<const char*> torn = {};  // there with any contents and a mode of `files`
    std::vector<const char*> free = {};  // not looked at; patterns of fnmatch(3) too

    // Of a failed fsync: how many the run makes after it.
    int fsyncs_after = 0;
    bool any_log = false;      // `log` is not looked at
    bool any_records = false;  // `records` is not looked at
};

struct FaultRule {
    const char* call;       // name of the call, as in kernel_control.h; "" for any
    const char* with = "";  // part of the call's text, such as "{dir}/a, O_RDWR"; "" for any
    int ordinal = 0;        // which of the calls of a run that match so far, from 1; 0 for any
    std::vector<int> errors = {};  // errnos and FaultKinds; empty for any
    size_t bytes = 0;  // that a transfer which comes back short still moves: 1; 0 for any number
    Outcome outcome = {};
};

// One run, for the checks of the case's own.
struct FaultRun {
    std::string call;  // text of the call that failed: "open({dir}/a, O_RDWR, 0777)"; "" when none
    int error = 0;     // errno or FaultKind; 0 when none
    size_t bytes = 0;  // that a transfer which came back short moved: 1, or half of them
    long long result = 0;
    int errno_after = 0;
    std::vector<std::string> calls;  // that can fail, in order, with platform calls and allocations
    size_t failed_at = 0;            // the index in `calls` of the one that failed
    const Outcome* expected = nullptr;  // null when a pair of calls failed

    // Calls made after the failing one whose text begins with `prefix`.
    int CountAfter(std::string_view prefix) const;
};

// The rules of a case are often those of its first half and its second.
using Rules = std::vector<FaultRule>;
Rules operator+(Rules left, const Rules& right);

struct FaultCase {
    const char* name;
    // Fills the folder, sets the platform's answers, opens what the call needs.
    std::function<void(FaultWorld&)> prepare = nullptr;
    // Calls one exported function; a pointer is returned as 0, or -1 when it is null.
    std::function<long long(FaultWorld&)> run = nullptr;
    // Frees what prepare and run left in the world. Also runs after a failure.
    std::function<void(FaultWorld&)> finish = nullptr;
    // Further expectations, after `run` and before `finish`; EXPECT_... away.
    std::function<void(FaultWorld&, const FaultRun&)> check = nullptr;
    // More that belongs to the state before and after, beside the folder: a handle's contents, a
    // list, attributes kept by a stand-in. Compared as the contents of a file named "(state)".
    std::function<std::string(FaultWorld&)> state = nullptr;
    // The run in which nothing fails; its `files` is not looked at.
    Outcome clean = {};
    std::vector<FaultRule> rules = {};
    // Also failing pairs: each failing call together with each later one.
    bool pairs = true;
};

// Transfers that are interrupted, or cut short with the rest to come, are taken up again.
FaultRule TakenUpAgain(const char* call, long long result = 0);

// A path that is derived on the heap, and found to be too long.
inline const std::string kLongPath(4095, 'a');

// Makes the process nobody's superuser, uid 1000, in `w.number`; every seteuid() succeeds that is
// not made to fail. UserOf() is a FaultCase's `state`.
void BeUser(FaultWorld& w);
std::string UserOf(FaultWorld& w);

// Runs it all, reports what differs, and prints how many calls failed; with MAVOEA_FAULT_CALLS in
// the environment, also the calls of the run in which nothing fails.
void SweepFaults(const FaultCase& fault_case);

// Whether this process holds a record lock on the file. Opens and closes it: drops such locks.
bool HoldsLock(const std::string& path);

// The errors that a call is made to fail with; its text as in FaultRun.
std::vector<int> PlausibleErrors(std::string_view call);

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_FAULT_SWEEP_H_

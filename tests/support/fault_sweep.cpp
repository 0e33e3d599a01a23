#include "tests/support/fault_sweep.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <optional>
#include <regex>
#include <set>
#include <sstream>

#include "tests/support/emulator.h"

namespace mavoea::test {
namespace {

// A run that makes more calls than this goes round in circles.
constexpr size_t kMaxCalls = 20'000;
constexpr int kMaxPairs = 3'000;  // of one case
constexpr int kMaxShown = 15;     // differing runs of one case

// ---- What calls can fail with ----

struct CallErrors {
    const char* name;
    std::vector<int> errors;
};

const std::vector<CallErrors>& ErrorTable() {
    static const std::vector<CallErrors>& table = *new std::vector<CallErrors>{
        {"malloc", {ENOMEM}},
        {"pread", {EIO, EINTR}},
        {"preadv", {EIO, EINTR}},
        {"pwrite", {EIO, ENOSPC, EINTR}},
        {"pwritev", {EIO, ENOSPC, EINTR}},
        {"lseek", {EIO}},
        {"ftruncate", {EIO, ENOSPC, EPERM, EINTR}},
        {"fallocate", {EIO, EOPNOTSUPP}},  // without room: the tests of full volumes
        {"fsync", {EIO, ENOSPC, EINTR}},
        {"fstat", {EIO}},
        {"filekind", {EIO}},
        {"stat", {EIO, EACCES, ENOENT, ENOMEM}},
        {"lstat", {EIO, EACCES, ENOENT, ENOMEM}},
        {"access", {EIO, EACCES, ENOENT, EROFS}},
        {"setlock", {EAGAIN, EACCES, ENOLCK, EINTR}},
        {"getlock", {EIO, ENOLCK}},
        {"mkdir", {EIO, ENOSPC, EACCES, EPERM, ENOENT, EROFS, EEXIST}},
        {"unlink", {EIO, EACCES, EPERM, ENOENT, EROFS}},
        {"rmdir", {EIO, EACCES, EPERM, ENOENT, ENOTEMPTY, EROFS}},
        {"remove", {EIO, EACCES, EPERM, ENOENT, EROFS}},
        {"link", {EEXIST, EIO, ENOSPC, EACCES, EPERM}},
        {"rename", {EIO, ENOSPC, EACCES, EPERM, ENOENT, EROFS}},
        {"chmod", {EIO, EACCES, EPERM, ENOENT, EROFS}},
        {"fchmod", {EIO, EPERM, EROFS}},
        {"getcwd", {ENOENT, EACCES}},
        {"chdir", {EIO, EACCES, ENOENT}},
        {"fchdir", {EIO, EACCES}},
        {"opendir", {EIO, EACCES, EMFILE, ENOENT, ENOMEM}},
        {"readdir", {EIO}},
        {"seteuid", {EPERM, EAGAIN}},
        {"system", {ENOMEM}},
        {"listxattr", {EIO, EACCES, ENOENT, ENODATA, ENOTSUP, ERANGE}},
        {"getxattr", {EIO, EACCES, EPERM, ENOENT, ENODATA, ENOTSUP, ERANGE}},
        {"setxattr", {EIO, ENOSPC, EACCES, EPERM, ENOENT, EROFS, ENOTSUP}},
        {"removexattr", {EIO, EACCES, EPERM, ENOENT, ENODATA, EROFS, ENOTSUP}},
        {"fread", {EIO}},
        {"fwrite", {EIO, ENOSPC}},
        {"fclose", {EIO, ENOSPC}},
        {"archive", {EIO, EPERM, EINVAL}},
        {"command", {EIO, EPERM, ENOENT, ENOSYS}},
        {"MLIBCExec", {kAnswer, kExitStatus}},
    };
    return table;
}

std::string_view NameOf(std::string_view call) { return call.substr(0, call.find('(')); }

bool IsTransfer(std::string_view name) {
    return name == "pread" || name == "preadv" || name == "pwrite" || name == "pwritev" ||
           name == "fread" || name == "fwrite";
}

bool IsPlatformCall(std::string_view name) {
    return name.starts_with("ML") || name.starts_with("MAVO");
}

std::string ErrorName(int error) {
    switch (error) {
        case 0:
            return "success";
        case kShort:
            return "short";
        case kShortOnce:
            return "short, once";
        case kShortThenNone:
            return "short, then nothing";
        case kNoneOnce:
            return "nothing, once";
        case kNone:
            return "nothing, for good";
        case kAnswer:
            return "-1";
        case kExitStatus:
            return "exit status 1";
        default:
            const char* const name = strerrorname_np(error);
            return name != nullptr ? name : std::to_string(error);
    }
}

// ---- What is looked at before and after ----

struct Node {
    mode_t mode = 0;
    uid_t owner = 0;
    gid_t group = 0;
    std::string contents;  // a link's target
    std::string attributes;
    bool operator==(const Node&) const = default;
};
using Tree = std::map<std::string, Node>;

// Descriptors that a look has opened. To close one would drop the locks that the run holds.
class HeldOpen {
 public:
    HeldOpen() = default;
    ~HeldOpen() {
        for (int fd : fds_) close(fd);
    }
    HeldOpen(const HeldOpen&) = delete;
    HeldOpen& operator=(const HeldOpen&) = delete;
    void Add(int fd) { fds_.push_back(fd); }

 private:
    std::vector<int> fds_;
};

std::string ContentsOf(const std::string& path, size_t size, HeldOpen* held) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return std::string("(not readable: ") + strerror(errno) + ")";
    held->Add(fd);
    std::string bytes(size, '\0');
    size_t done = 0;
    while (done < size) {
        const ssize_t got = pread(fd, bytes.data() + done, size - done, static_cast<off_t>(done));
        if (got <= 0) break;
        done += static_cast<size_t>(got);
    }
    bytes.resize(done);
    return bytes;
}

// The attributes of the user, in the order of their names.
std::string AttributesOf(const std::string& path) {
    char names[4096];
    const ssize_t size = llistxattr(path.c_str(), names, sizeof names);
    if (size <= 0) return {};
    std::map<std::string, std::string> attributes;
    for (ssize_t at = 0; at < size;) {
        const std::string name = names + at;
        at += static_cast<ssize_t>(name.size()) + 1;
        if (!name.starts_with("user.")) continue;
        char value[65536];
        const ssize_t length = lgetxattr(path.c_str(), name.c_str(), value, sizeof value);
        attributes[name] =
            length < 0 ? "(not readable)" : std::string(value, static_cast<size_t>(length));
    }
    std::string text;
    for (const auto& [name, value] : attributes) {
        text.append(name).append("=").append(value).append("\n");
    }
    return text;
}

void Look(const std::string& root, const std::string& below, Tree* tree, HeldOpen* held) {
    const std::string path = root + "/" + below;
    DIR* const directory = opendir(path.c_str());
    if (directory == nullptr) return;
    while (const dirent* entry = readdir(directory)) {
        const std::string name = entry->d_name;
        if (name == "." || name == "..") continue;
        const std::string relative = below.empty() ? name : below + "/" + name;
        const std::string whole = root + "/" + relative;
        struct stat info;
        if (lstat(whole.c_str(), &info) != 0) continue;
        Node node{info.st_mode, info.st_uid, info.st_gid, {}, {}};
        if (S_ISREG(info.st_mode)) {
            node.contents = ContentsOf(whole, static_cast<size_t>(info.st_size), held);
        } else if (S_ISLNK(info.st_mode)) {
            node.contents = std::filesystem::read_symlink(whole).string();
        }
        if (!S_ISLNK(info.st_mode)) node.attributes = AttributesOf(whole);
        (*tree)[relative] = std::move(node);
        if (S_ISDIR(info.st_mode)) Look(root, relative, tree, held);
    }
    closedir(directory);
}

std::set<int> OpenDescriptors() {
    std::set<int> fds;
    DIR* const directory = opendir("/proc/self/fd");
    if (directory == nullptr) abort();
    while (const dirent* entry = readdir(directory)) {
        if (entry->d_name[0] != '.') fds.insert(atoi(entry->d_name));
    }
    fds.erase(dirfd(directory));
    closedir(directory);
    return fds;
}

struct Identity {
    uid_t user = 0;
    gid_t group = 0;
    mode_t mask = 0;
    std::string directory;
    bool operator==(const Identity&) const = default;
};

Identity CurrentIdentity() {
    Identity now;
    now.user = geteuid();
    now.group = getegid();
    now.mask = umask(0);
    umask(now.mask);
    char directory[4096];
    now.directory = getcwd(directory, sizeof directory) != nullptr ? directory : "(none)";
    return now;
}

void Restore(const Identity& identity) {
    if (geteuid() != identity.user && seteuid(identity.user) != 0) abort();
    umask(identity.mask);
    if (chdir(identity.directory.c_str()) != 0) abort();
}

std::string ReplaceAll(std::string text, const std::string& from, const std::string& to) {
    for (size_t at = 0; (at = text.find(from, at)) != std::string::npos; at += to.size()) {
        text.replace(at, from.size(), to);
    }
    return text;
}

// "LINE" for the line of a record that a log line quotes: "[0x0B00 eas_write:123]".
std::string WithoutQuotedLines(const std::string& line) {
    static const std::regex& quoted = *new std::regex("(0x[0-9A-F]{4} [a-z_.]*):-?[0-9]+");
    return std::regex_replace(line, quoted, "$1:LINE");
}

// ---- One run ----

struct Injection {
    size_t at = 0;  // index of the call in the run
    int error = 0;
    size_t bytes = 0;  // of a short transfer
};

struct Call {
    std::string text;
    long long result = 0;  // where it is a number and the call was made
};

struct RunLog {
    FaultRun run;
    std::vector<Call> calls;
    std::vector<Record> records;
    std::vector<std::string> log;
    Tree before;
    Tree after;
    bool reached = true;             // every injection found its call
    std::vector<std::string> wrong;  // what no run may do
};

// Makes the calls of one run fail, and notes them all.
class Injector {
 public:
    Injector(const std::string& dir, std::vector<Injection> injections)
        : dir_(dir), injections_(std::move(injections)) {}

    int Kernel(const std::string& text) {
        const Injection* const injection = Next(text);
        pending_ = nullptr;
        if (injection == nullptr) return 0;
        if (injection->error < kShort) return injection->error;
        pending_ = injection;
        return 0;
    }

    size_t Grant(size_t size) {
        if (pending_ != nullptr) {
            if (pending_->error == kShortThenNone || pending_->error == kNone) {
                dry_ = NameOf(calls_.back().text);
            }
            return std::min(size, std::exchange(pending_, nullptr)->bytes);
        }
        return !dry_.empty() && NameOf(calls_.back().text) == dry_ ? 0 : size;
    }

    void Gave(long long result) { calls_.back().result = result; }

    int Platform(const std::string& text) {
        const Injection* const injection = Next(text);
        if (injection == nullptr) return 0;
        return injection->error == kExitStatus ? 1 : -1;
    }

    std::vector<Call>& calls() { return calls_; }
    bool reached() const { return injections_.empty() || injections_.back().at < calls_.size(); }

 private:
    const Injection* Next(const std::string& text) {
        const size_t at = calls_.size();
        if (at >= kMaxCalls) {
            fprintf(stderr, "faults: a run goes round in circles, last call %s\n", text.c_str());
            abort();
        }
        calls_.push_back({ReplaceAll(text, dir_, "{dir}"), 0});
        for (const Injection& injection : injections_) {
            if (injection.at == at) return &injection;
        }
        return nullptr;
    }

    const std::string dir_;
    const std::vector<Injection> injections_;
    std::vector<Call> calls_;
    const Injection* pending_ = nullptr;
    std::string dry_;  // transfers of this name move nothing any more
};

std::string Describe(const FaultCase& fault_case, const RunLog& run,
                     const std::vector<Injection>& injections) {
    std::string text = std::string(fault_case.name) + ":";
    if (injections.empty()) return text + " nothing fails";
    for (const Injection& injection : injections) {
        const bool known = injection.at < run.calls.size();
        text += (&injection == &injections.front() ? " " : " and ") +
                (known ? run.calls[injection.at].text : "call") + " #" +
                std::to_string(injection.at + 1) + " -> " + ErrorName(injection.error);
        if (injection.error >= kShort && injection.bytes > 0) {
            text += " (" + std::to_string(injection.bytes) + " bytes)";
        }
    }
    return text;
}

// `expected` gives the outcome that the case's own check is told, once the calls are known.
template <class Expected>
RunLog RunOnce(const FaultCase& fault_case, const std::string& root,
               const std::vector<Injection>& injections, Expected expected) {
    RunLog log;
    ResetKernel();
    ResetPlatform();
    const auto descriptors_before = OpenDescriptors();
    const int blocks_before = TakeAllocations().live;
    auto held = std::make_unique<HeldOpen>();

    auto world = std::make_unique<FaultWorld>();
    world->dir = root + "/w";
    if (mkdir(world->dir.c_str(), 0777) != 0 || chmod(world->dir.c_str(), 0777) != 0) abort();
    Hooks().fsync = [](int) { return 0; };
    Hooks().sync = [] {};
    if (fault_case.prepare) fault_case.prepare(*world);

    const auto look = [&](Tree* tree) {
        Look(world->dir, "", tree, held.get());
        if (fault_case.state) (*tree)["(state)"].contents = fault_case.state(*world);
    };
    look(&log.before);
    const auto descriptors_prepared = OpenDescriptors();
    const Identity identity = CurrentIdentity();

    Injector injector(world->dir, injections);
    Hooks().fails = [&](const std::string& call) { return injector.Kernel(call); };
    Hooks().grants = [&](size_t size) { return injector.Grant(size); };
    Hooks().gave = [&](long long result) { injector.Gave(result); };
    Platform().fails = [&](const std::string& call) { return injector.Platform(call); };
    TakeRecords();
    TakeLog();

    errno = 0;
    log.run.result = fault_case.run(*world);
    log.run.errno_after = errno;

    Hooks().fails = nullptr;
    Hooks().grants = nullptr;
    Hooks().gave = nullptr;
    Platform().fails = nullptr;
    log.records = TakeRecords();
    for (const std::string& line : TakeLog()) {
        log.log.push_back(WithoutQuotedLines(ReplaceAll(line, world->dir, "{dir}")));
    }
    log.reached = injector.reached();
    log.calls = std::move(injector.calls());
    for (const Call& call : log.calls) log.run.calls.push_back(call.text);

    const Identity identity_after = CurrentIdentity();
    if (identity_after != identity) {
        std::ostringstream out;
        out << "identity: uid " << identity.user << ", gid " << identity.group << ", umask 0"
            << std::oct << identity.mask << std::dec << ", in " << identity.directory << " became "
            << identity_after.user << ", " << identity_after.group << ", 0" << std::oct
            << identity_after.mask << ", " << identity_after.directory;
        log.wrong.push_back(out.str());
        Restore(identity);
    }
    for (int fd : descriptors_prepared) {
        if (fcntl(fd, F_GETFD) < 0) {
            log.wrong.push_back("closed a descriptor of its caller: " + std::to_string(fd));
        }
    }
    look(&log.after);

    if (!injections.empty() && injections[0].at < log.calls.size()) {
        log.run.call = log.calls[injections[0].at].text;
        log.run.error = injections[0].error;
        log.run.bytes = injections[0].bytes;
        log.run.failed_at = injections[0].at;
    }
    {
        SCOPED_TRACE(Describe(fault_case, log, injections));
        log.run.expected = expected(log);
        if (fault_case.check) fault_case.check(*world, log.run);
        if (fault_case.finish) fault_case.finish(*world);
    }
    log.run.expected = nullptr;
    world.reset();
    held.reset();

    const int blocks = TakeAllocations().live - blocks_before;
    if (blocks != 0) {
        log.wrong.push_back(std::to_string(blocks) + " more blocks of memory than before");
    }
    const auto descriptors = OpenDescriptors();
    for (int fd : descriptors) {
        if (!descriptors_before.contains(fd)) {
            char link[512] = {};
            const std::string name = "/proc/self/fd/" + std::to_string(fd);
            if (readlink(name.c_str(), link, sizeof link - 1) < 0) link[0] = '\0';
            log.wrong.push_back(std::string("left open: ") + link);
            close(fd);
        }
    }
    std::error_code failed;
    std::filesystem::remove_all(root + "/w", failed);
    if (failed) abort();
    ResetKernel();
    ResetPlatform();
    return log;
}

// ---- Expectations ----

// Bytes as a person can tell them apart.
std::string Shown(const Node* node) {
    if (node == nullptr) return "nothing";
    std::ostringstream out;
    out << "mode 0" << std::oct << node->mode << std::dec << ", owner " << node->owner << ", "
        << node->contents.size() << " bytes";
    if (!node->contents.empty()) out << ":";
    for (size_t i = 0; i < node->contents.size() && i < 64; ++i) {
        const auto byte = static_cast<unsigned char>(node->contents[i]);
        char text[8];
        snprintf(text, sizeof text, byte >= ' ' && byte < 127 ? "%c" : "\\%02x", byte);
        out << (i == 0 ? " " : "") << text;
    }
    if (!node->attributes.empty()) out << ", attributes " << node->attributes.size() << " bytes";
    return out.str();
}

const Node* Find(const Tree& tree, const std::string& name) {
    const auto found = tree.find(name);
    return found == tree.end() ? nullptr : &found->second;
}

bool Same(const Node* a, const Node* b) { return a == nullptr || b == nullptr ? a == b : *a == *b; }

bool Named(const std::vector<const char*>& names, const std::string& name) {
    return std::any_of(names.begin(), names.end(),
                       [&](const char* pattern) { return fnmatch(pattern, name.c_str(), 0) == 0; });
}

// What differs from the folder that `files` and the lists of `outcome` describe.
std::vector<std::string> Differences(const Outcome& outcome, Files files, const Tree& before,
                                     const Tree& done, const Tree& after) {
    std::vector<std::string> different;
    std::set<std::string> names;
    for (const Tree* tree : {&before, &done, &after}) {
        for (const auto& [name, node] : *tree) names.insert(name);
    }
    for (const auto* list : {&outcome.made, &outcome.torn})
        names.insert(list->begin(), list->end());
    for (const std::string& name : names) {
        const Node* const old = Find(before, name);
        const Node* const made = Find(done, name);
        const Node* const now = Find(after, name);
        const auto differs = [&](const std::string& wanted) {
            different.push_back(name + ": is " + Shown(now) + "; wanted " + wanted);
        };
        const auto mode_fits = [&] {
            return old == nullptr || old->mode == now->mode ||
                   (made != nullptr && made->mode == now->mode);
        };
        if (Named(outcome.free, name)) continue;
        if (Named(outcome.gone, name)) {
            if (now != nullptr) differs("nothing");
        } else if (Named(outcome.made, name) || Named(outcome.torn, name)) {
            if (now == nullptr) {
                differs("a file");
            } else if (!mode_fits()) {
                differs("the mode as before " + Shown(old));
            }
        } else if (files == Files::kKept) {
            if (!Same(now, old)) differs("as before " + Shown(old));
        } else if (files == Files::kDone) {
            if (!Same(now, made)) differs("as without a failure " + Shown(made));
        } else if (files == Files::kEach) {
            if (!Same(now, old) && !Same(now, made)) {
                differs("as before " + Shown(old) + ", or as without a failure " + Shown(made));
            }
        }
    }
    return different;
}

std::string Shown(const std::vector<std::string>& lines) {
    if (lines.empty()) return " none";
    std::string text;
    for (const std::string& line : lines) text += "\n      " + line;
    return text;
}

std::string RecordText(int code, const std::string& unit) {
    char text[32];
    snprintf(text, sizeof text, "0x%X ", static_cast<unsigned>(code));
    return text + unit;
}

void CompareReports(const Outcome& outcome, int error, const RunLog& log,
                    std::vector<std::string>* wrong) {
    if (log.run.result != outcome.result) {
        wrong->push_back("result " + std::to_string(log.run.result) + "; wanted " +
                         std::to_string(outcome.result));
    }
    std::vector<std::string> records;
    for (const Record& record : log.records) {
        records.push_back(RecordText(record.code, record.unit));
    }
    std::vector<std::string> wanted_records;
    for (const ExpectedRecord& record : outcome.records) {
        wanted_records.push_back(RecordText(record.code, record.unit));
    }
    if (!outcome.any_records && records != wanted_records) {
        wrong->push_back("records" + Shown(records) + "\n    wanted" + Shown(wanted_records));
    }
    std::vector<std::string> wanted_log;
    for (const char* line : outcome.log) {
        wanted_log.push_back(ReplaceAll(line, "{error}", error < kShort ? strerror(error) : ""));
    }
    if (!outcome.any_log && log.log != wanted_log) {
        wrong->push_back("log" + Shown(log.log) + "\n    wanted" + Shown(wanted_log));
    }
    const int wanted_errno = outcome.error == kInjectedErrno ? error : outcome.error;
    if (outcome.error != kAnyErrno && log.run.errno_after != wanted_errno) {
        wrong->push_back("errno " + ErrorName(log.run.errno_after) + "; wanted " +
                         ErrorName(wanted_errno));
    }
}

void CompareFiles(const Outcome& outcome, const RunLog& log, const Tree& done,
                  std::vector<std::string>* wrong) {
    const Files files = outcome.files;
    if (files == Files::kAnything) return;
    auto differences = Differences(outcome, files == Files::kEither ? Files::kKept : files,
                                   log.before, done, log.after);
    if (files == Files::kEither && !differences.empty()) {
        auto others = Differences(outcome, Files::kDone, log.before, done, log.after);
        if (others.empty()) {
            differences.clear();
        } else {
            differences.insert(differences.end(), others.begin(), others.end());
        }
    }
    wrong->insert(wrong->end(), differences.begin(), differences.end());
}

bool Matches(const FaultRule& rule, const std::string& call) {
    return (*rule.call == '\0' || NameOf(call) == rule.call) &&
           call.find(rule.with) != std::string::npos;
}

bool Covers(const FaultRule& rule, int error) {
    if (rule.errors.empty()) return true;
    return std::any_of(rule.errors.begin(), rule.errors.end(), [error](int wanted) {
        return wanted == error || (wanted == kShort && error > kShort && error <= kNone);
    });
}

// The first rule for the failing call of this run; the number of rules when there is none.
size_t RuleFor(const FaultCase& fault_case, const RunLog& log) {
    const auto& rules = fault_case.rules;
    for (size_t i = 0; i < rules.size(); ++i) {
        const FaultRule& rule = rules[i];
        if (!Matches(rule, log.run.call) || !Covers(rule, log.run.error)) continue;
        if (rule.bytes != 0 && rule.bytes != log.run.bytes) continue;
        const auto end = log.calls.begin() + static_cast<std::ptrdiff_t>(log.run.failed_at) + 1;
        const auto ordinal = std::count_if(
            log.calls.begin(), end, [&](const Call& call) { return Matches(rule, call.text); });
        if (rule.ordinal == 0 || ordinal == rule.ordinal) return i;
    }
    return rules.size();
}

// Every way in which a call that was made can fail.
std::vector<Injection> InjectionsFor(size_t at, const Call& call) {
    std::vector<Injection> injections;
    for (int error : PlausibleErrors(call.text)) injections.push_back({at, error, 0});
    if (!IsTransfer(NameOf(call.text)) || call.result <= 0) return injections;
    const auto moved = static_cast<size_t>(call.result);
    injections.push_back({at, kNoneOnce, 0});
    injections.push_back({at, kNone, 0});
    for (size_t bytes : std::set<size_t>{1, moved / 2}) {
        if (bytes == 0 || bytes >= moved) continue;
        injections.push_back({at, kShortOnce, bytes});
        injections.push_back({at, kShortThenNone, bytes});
    }
    return injections;
}

class Sweep {
 public:
    explicit Sweep(const FaultCase& fault_case)
        : case_(fault_case),
          root_(FastDirectory()),
          used_(fault_case.rules.size()),
          unreserved_(fault_case.clean) {
        unreserved_.files = Files::kDone;
    }

    void Run() {
        clean_ = RunOnce(case_, root_.path(), {}, [&](RunLog&) { return &case_.clean; });
        if (getenv("MAVOEA_FAULT_CALLS") != nullptr) {
            for (const Call& call : clean_.calls) {
                printf("%s = %lld\n", call.text.c_str(), call.result);
            }
        }
        auto wrong = clean_.wrong;
        CompareReports(case_.clean, 0, clean_, &wrong);
        if (!wrong.empty()) return Report(clean_, {}, wrong);

        int number = 0;
        for (size_t at = 0; at < clean_.calls.size(); ++at) {
            std::set<std::string> roads;
            for (const Injection& injection : InjectionsFor(at, clean_.calls[at])) {
                if (number++ % kSeriesStep == 0) RunSingle(injection, &roads);
            }
        }
        for (size_t i = 0; i < used_.size() && !kEmulated; ++i) {
            if (used_[i]) continue;
            const FaultRule& rule = case_.rules[i];
            ADD_FAILURE() << case_.name << ": no failure needs rule " << i + 1 << ", " << rule.call
                          << "(..." << rule.with << "...)";
        }
        RunPairs();
        if (shown_ > kMaxShown) {
            ADD_FAILURE() << case_.name << ": " << shown_ - kMaxShown << " more runs differ";
        }
        printf("faults: %s: %d calls failed, %d pairs\n", case_.name, singles_, pairs_);
        fflush(stdout);
    }

 private:
    void Report(const RunLog& log, const std::vector<Injection>& injections,
                const std::vector<std::string>& wrong) {
        if (wrong.empty() || ++shown_ > kMaxShown) return;
        std::string text = Describe(case_, log, injections);
        for (const std::string& line : wrong) text += "\n    " + line;
        ADD_FAILURE() << text;
    }

    void RunSingle(const Injection& injection, std::set<std::string>* roads) {
        const Outcome* expected = nullptr;
        const RunLog log =
            RunOnce(case_, root_.path(), {injection}, [&](RunLog& run) -> const Outcome* {
                if (run.run.call.empty()) return nullptr;
                const size_t rule = RuleFor(case_, run);
                if (rule < case_.rules.size()) {
                    used_[rule] = true;
                    expected = &case_.rules[rule].outcome;
                } else if (NameOf(run.run.call) == "fallocate") {
                    expected = &unreserved_;
                }
                return expected;
            });
        ++singles_;
        auto wrong = log.wrong;
        if (!SameUpTo(injection.at, log)) {
            wrong.emplace_back("the calls before it were not those of the first run");
        } else if (expected == nullptr) {
            std::string what = "no rule says what is to come of it; result " +
                               std::to_string(log.run.result) + ", records";
            for (const Record& record : log.records) {
                what += " " + RecordText(record.code, record.unit);
            }
            what += ", log" + Shown(log.log);
            wrong.push_back(what);
        } else {
            const Outcome& outcome = *expected;
            CompareReports(outcome, injection.error, log, &wrong);
            CompareFiles(outcome, log, clean_.after, &wrong);
            const int fsyncs = log.run.CountAfter("fsync(");
            if (NameOf(log.run.call) == "fsync" && fsyncs != outcome.fsyncs_after) {
                wrong.push_back(std::to_string(fsyncs) + " fsyncs after the failed one");
            }
        }
        Report(log, {injection}, wrong);

        // Each road that a failing call leads to is walked once more, with another failure on it.
        std::string road;
        for (size_t i = injection.at + 1; i < log.calls.size(); ++i) road += log.calls[i].text;
        if (!case_.pairs || injection.error >= kShort || !roads->insert(road).second) return;
        for (size_t i = injection.at + 1; i < log.calls.size(); ++i) {
            const auto errors = PlausibleErrors(log.calls[i].text);
            if (!errors.empty()) {
                second_.push_back({injection, {i, errors.front(), 0}, log.run.result < 0});
            }
        }
    }

    bool SameUpTo(size_t at, const RunLog& log) const {
        if (!log.reached || log.calls.size() <= at) return false;
        for (size_t i = 0; i <= at; ++i) {
            if (log.calls[i].text != clean_.calls[i].text) return false;
        }
        return true;
    }

    void RunPairs() {
        const size_t step = second_.size() / kMaxPairs + 1;
        for (size_t i = 0; i < second_.size(); i += step) {
            const auto& [first, second, failed] = second_[i];
            const RunLog log = RunOnce(case_, root_.path(), {first, second},
                                       [](RunLog&) -> const Outcome* { return nullptr; });
            ++pairs_;
            auto wrong = log.wrong;
            if (failed && log.run.result >= 0) {
                wrong.push_back("the second failure makes a success of it: result " +
                                std::to_string(log.run.result));
            }
            Report(log, {first, second}, wrong);
        }
    }

    struct Pair {
        Injection first;
        Injection second;
        bool failed;  // with the first alone
    };

    const FaultCase& case_;
    TempDir root_;
    RunLog clean_;
    std::vector<bool> used_;
    Outcome unreserved_;  // a volume that cannot reserve room is written to all the same
    std::vector<Pair> second_;
    int singles_ = 0;
    int pairs_ = 0;
    int shown_ = 0;
};

}  // namespace

int FaultRun::CountAfter(std::string_view prefix) const {
    int count = 0;
    for (size_t i = failed_at + 1; i < calls.size(); ++i) {
        if (calls[i].starts_with(prefix)) ++count;
    }
    return count;
}

std::vector<int> PlausibleErrors(std::string_view call) {
    const std::string_view name = NameOf(call);
    if (name == "open" || name == "fopen") {
        std::vector<int> errors = {EIO, EACCES, EPERM, EMFILE, ENOENT, EINTR, ENOMEM};
        const bool writes =
            name == "open" ? call.find("O_RDONLY") == call.npos || call.find("O_CREAT") != call.npos
                           : !call.ends_with(", r)") && !call.ends_with(", rb)");
        if (writes) errors.insert(errors.end(), {EROFS, ENOSPC});
        return errors;
    }
    for (const CallErrors& row : ErrorTable()) {
        if (row.name == name) return row.errors;
    }
    if (IsPlatformCall(name)) return {kAnswer};
    return {EIO};
}

bool HoldsLock(const std::string& path) {
    const int fd = open(path.c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0) return false;
    // A lock of the open file belongs to another owner than those of the process.
    struct flock64 lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    const bool held = fcntl(fd, F_OFD_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
    close(fd);
    return held;
}

Rules operator+(Rules left, const Rules& right) {
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

FaultRule TakenUpAgain(const char* call, long long result) {
    return {.call = call,
            .errors = {EINTR, kShortOnce},
            .outcome = {.result = result, .files = Files::kDone}};
}

void BeUser(FaultWorld& w) {
    w.number = 1000;
    Hooks().geteuid = [&w] { return static_cast<uid_t>(w.number); };
    Hooks().seteuid = [&w](uid_t uid) {
        w.number = static_cast<int>(uid);
        return 0;
    };
}
std::string UserOf(FaultWorld& w) { return "uid " + std::to_string(w.number); }

void SweepFaults(const FaultCase& fault_case) { Sweep(fault_case).Run(); }

}  // namespace mavoea::test

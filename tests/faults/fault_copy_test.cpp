// Every call that fails while an object's metadata is copied or moved, between volumes of every
// two kinds.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <deque>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fault_sweep.h"
#include "tests/support/mac_attributes.h"
#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

constexpr char kRecord[] = "user.netatalk.Metadata";

// ---- The two ends -------------------------------------------------------------------------------

// One way of copying.
struct Way {
    int src_type = 1;
    int dst_type = 1;
    int move = 0;
    bool with_callback = false;
    int copy_eadir = 0;
    bool directory = false;
};

ObjectFiles Source(const FaultWorld& w) { return {w / "src", "a"}; }
ObjectFiles Destination(const FaultWorld& w) { return {w / "dst", "b"}; }

// The commands, in this process, with the exit statuses that they have.
int Run(const std::vector<std::string>& argv) {
    std::error_code error;
    if (argv[0] == "/bin/rm") {
        std::filesystem::remove_all(argv[2], error);
    } else if (argv[0] == "/bin/mv") {
        std::filesystem::rename(argv[2], argv[3], error);
    } else {
        std::filesystem::copy_file(argv[2], argv[3],
                                   std::filesystem::copy_options::overwrite_existing, error);
    }
    return error ? 1 : 0;
}

int CopyFn(const char* from, const char* to) {
    // A platform call by name, so that it is made to fail as those are.
    return MLIBCExec("(callback)", from, to, nullptr);
}
int RunOrCallBack(const std::vector<std::string>& argv) {
    if (argv[0] != "(callback)") return Run(argv);
    return Run({"/bin/cp", "-f", argv[1], argv[2]}) == 0 ? 0 : -1;
}

const Bytes& Value() {
    static const Bytes& value = *new Bytes(Pattern(40, 1));
    return value;
}
const Bytes& ForkBytes() {
    static const Bytes& fork = *new Bytes(Pattern(64, 2));
    return fork;
}
const Bytes& FinderInfoBytes() {
    static const Bytes& info = *new Bytes(Pattern(32, 0x40));
    return info;
}

void Prepare(FaultWorld& w, const Way& way) {
    Hooks().archive = [](int) { return 0; };
    Hooks().command = [](const char*, int) { return 0; };
    Hooks().time = [] { return time_t{0x41424344}; };
    StandInForMacAttributes();
    Platform().exec = RunOrCallBack;

    const ObjectFiles src = Source(w);
    const ObjectFiles dst = Destination(w);
    for (const ObjectFiles& end : {src, dst}) {
        MakeDir(end.parent);
        if (way.directory) {
            MakeDir(end.object());
        } else {
            WriteFile(end.object(), Ascii("data"));
        }
        ASSERT_EQ(0, chmod(end.object().c_str(), 0744));
        if (!way.directory) WriteFile(ForkFile(end.object()), {});
    }
    const std::vector<Attribute> attributes = {{"user.k", Value()}};
    switch (way.src_type) {
        case 0:
            WriteFile(src.sidecar(), StreamImage{.attributes = attributes,
                                                 .fork = ForkBytes(),
                                                 .finder_info = FinderInfoBytes()}
                                         .Build());
            break;
        case 7:
            SetAttribute(src.object(), "user.k", Value());
            SetAttribute(src.object(), kMacFinderInfo, FinderInfoBytes());
            if (!way.directory) WriteFile(ForkFile(src.object()), ForkBytes());
            break;
        default:
            src.MakeFolder();
            WriteFile(src.resource(), PlainAppleDouble(FinderInfoBytes(), ForkBytes()));
            WriteFile(src.stream(), StreamImage{.attributes = attributes}.Build());
            WriteFile(src.folder() + "/MAVOThumb", Ascii("thumb"));
            if (way.src_type == 2) SetAttribute(src.object(), kRecord, AttributeRecord());
    }
}

long long Copy(const FaultWorld& w, const Way& way) {
    std::string dst = Destination(w).object();
    return MAVOEACopyEx(Source(w).object().c_str(), dst.data(), way.move, way.copy_eadir,
                        way.src_type, way.dst_type, 0, 0, way.with_callback ? CopyFn : nullptr);
}

// ---- What is carried ----------------------------------------------------------------------------

// What somebody who looks for an object's metadata finds at one end, wherever it is kept, each
// piece by itself.
using Pieces = std::multimap<std::string, Bytes>;

Pieces PiecesAt(const ObjectFiles& files) {
    Pieces pieces;
    for (const std::string& file : {files.sidecar(), files.stream(), files.resource()}) {
        if (!Exists(file)) continue;
        const auto contents = ReadMacFile(ReadFile(file));
        if (!contents) continue;
        for (const auto& [name, value] : contents->attributes) {
            pieces.emplace("attribute " + name, value);
        }
        if (contents->finder_info != Repeat(0, 32)) {
            pieces.emplace("Finder info", contents->finder_info);
        }
        if (!contents->fork.empty()) pieces.emplace("fork", contents->fork);
    }
    if (Exists(files.object())) {
        for (const auto& [name, value] : AttributesOf(files.object())) {
            pieces.emplace(name == kMacFinderInfo ? "Finder info"
                           : name == kMacFork     ? "fork"
                                                  : "attribute " + name,
                           value);
        }
    }
    const std::string thumb = files.folder() + "/MAVOThumb";
    if (Exists(thumb)) pieces.emplace("MAVOThumb", ReadFile(thumb));
    return pieces;
}

bool Has(const Pieces& pieces, const std::string& name, const Bytes& bytes) {
    const auto [begin, end] = pieces.equal_range(name);
    return std::any_of(begin, end, [&](const auto& piece) { return piece.second == bytes; });
}

// Every file at an end, with its mode.
std::map<std::string, std::string> Snapshot(const std::string& root) {
    std::map<std::string, std::string> all;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root)) {
        const std::string path = entry.path().string();
        std::string& text = all[path];
        text = std::to_string(ModeOf(path)) + " ";
        if (!entry.is_directory()) {
            const Bytes bytes = ReadFile(path);
            text.append(bytes.begin(), bytes.end());
        }
    }
    return all;
}

struct Before {
    std::map<std::string, std::string> source;
    Pieces pieces;
};

bool Says(const FaultRun& run, std::string_view text) {
    return run.call.find(text) != run.call.npos;
}

// Which pieces the failure may cost, because what was asked of the copy, or what the failing call
// said, is that they are not there or have arrived.
bool MayLose(const Way& way, const FaultRun& run, const std::string& piece) {
    const bool nothing = run.error >= kShortThenNone && run.error <= kNone;
    // A file that is said to be missing, or to end, has nothing more to carry.
    if (run.error == ENOENT && Says(run, "{dir}/src/")) return true;
    if (run.call.starts_with("listxattr") && (run.error == ENOENT || run.error == ENODATA))
        return true;
    if (run.call.starts_with("pread") && nothing) return true;
    if (run.call.starts_with("mkdir") && run.error == EEXIST) return true;
    // The exit status of /bin/cp tells nothing, and a callback that gives one says it is done.
    if (run.call.starts_with("MLIBCExec(/bin/cp") && run.error == kExitStatus) return true;
    if (run.call.starts_with("MLIBCExec((callback)") && run.error == kExitStatus) return true;
    // A source file that cannot be looked for counts as missing.
    if (run.call.starts_with("access({dir}/src/@eaDir/a@Mavo")) return true;
    // Without its table of entries a file is read as one of the plain layout.
    if (run.call.starts_with("pread") && way.src_type != 7 && piece == "fork") return true;
    // The attributes go into the "._" file when the resource file has gone: a rewriting that breaks
    // off leaves it a mix of before and after.
    if (run.call.starts_with("pwrite(180, 0)") && run.error >= kShort && way.dst_type == 0) {
        return true;
    }
    // A "._" file goes with its Finder info, whether or not all attributes have gone before.
    if (way.src_type == 0 && way.dst_type == 7 && run.result < 0) return true;
    // The folder of a move goes, wherever its files have gone.
    if (piece == "MAVOThumb") {
        return Says(run, "{dir}/dst/@eaDir") || run.call.starts_with("malloc") ||
               run.call.starts_with("fstat") || run.call.starts_with("MLIBCExec(");
    }
    return false;
}

// What no failure may do: change the source of a copy, or remove from that of a move what has not
// arrived.
void ExpectKept(FaultWorld& w, const Way& way, const FaultRun& run) {
    const auto* const before = static_cast<const Before*>(w.own.get());
    if (way.move == 0) {
        EXPECT_TRUE(before->source == Snapshot(w / "src")) << "the copy changed its source";
        return;
    }
    // What two failures together may cost is not told here.
    if (run.expected == nullptr && !run.call.empty()) return;
    const Pieces src = PiecesAt(Source(w));
    const Pieces dst = PiecesAt(Destination(w));
    for (const auto& [name, bytes] : before->pieces) {
        if (Has(src, name, bytes) || Has(dst, name, bytes)) continue;
        if (name == std::string("attribute ") + kRecord)
            continue;  // made anew, or not wanted there
        // To an AppleDouble volume the folder is not carried.
        if (name == "MAVOThumb" && way.dst_type == 0) continue;
        if (!MayLose(way, run, name)) ADD_FAILURE() << name << " is at neither end";
    }
}

// ---- Rules --------------------------------------------------------------------------------------

using Lines = std::vector<std::string>;
using Records = std::vector<ExpectedRecord>;

const char* Kept(const std::string& text) {
    static std::deque<std::string>& all = *new std::deque<std::string>;
    for (const std::string& known : all) {
        if (known == text) return known.c_str();
    }
    return all.emplace_back(text).c_str();
}

constexpr char kS[] = "{dir}/src/a";
constexpr char kD[] = "{dir}/dst/b";
constexpr char kSrcDouble[] = "{dir}/src/._a";
constexpr char kDstDouble[] = "{dir}/dst/._b";
constexpr char kSrcResource[] = "{dir}/src/@eaDir/a@MavoResource";
constexpr char kSrcStream[] = "{dir}/src/@eaDir/a@MavoEAStream";
constexpr char kDstResource[] = "{dir}/dst/@eaDir/b@MavoResource";
constexpr char kDstStream[] = "{dir}/dst/@eaDir/b@MavoEAStream";

std::string Line(const std::string& text) {
    return (text.starts_with('(') ? "ea_copy.c:LINE" : "ea_copy.c:LINE ") + text;
}

// "[0x0B00 eas_write:LINE]" of the last record, "[0x0000 :LINE]" where there is none.
std::string Quote(const Records& records) {
    char code[16];
    snprintf(code, sizeof code, "[0x%04X ",
             records.empty() ? 0U : static_cast<unsigned>(records.back().code));
    return code + std::string(records.empty() ? "" : records.back().unit) + ":LINE]";
}
std::string Pair(const char* what, const Records& records) {
    return Line(Quote(records) + what + " [" + kS + "]->[" + kD + "]. {error}");
}
std::string FailLine(const Records& records) {
    return Line(Quote(records) + "EACopy fail: from [" + kS + "] to [" + kD + "] {error}");
}

// A failure of the whole, with exactly these records and lines, and then the driver's line.
Outcome Failed(const Records& records, const Lines& lines, int result = -1) {
    Outcome outcome = {.result = result, .records = records, .files = Files::kAnything};
    for (const std::string& line : lines) outcome.log.push_back(Kept(line));
    outcome.log.push_back(Kept(FailLine(records)));
    return outcome;
}

// One way of copying: what a run without a failure does, and rules in the order in which they are
// looked at.
class Table {
 public:
    explicit Table(const Way& way) : way_(way) {
        FaultWorld w;
        const TempDir dir;
        w.dir = dir / "w";
        MakeDir(w.dir);
        ResetKernel();
        ResetPlatform();
        Prepare(w, way);
        const auto note = [&](const std::string& call) {
            std::string text = call;
            for (auto at = text.find(w.dir); at != text.npos; at = text.find(w.dir)) {
                text.replace(at, w.dir.size(), "{dir}");
            }
            calls_.push_back(text);
            return 0;
        };
        Hooks().fsync = [](int) { return 0; };
        Hooks().sync = [] {};
        Hooks().fails = note;
        Platform().fails = note;
        (void)TakeRecords();
        Copy(w, way);
        for (const Record& record : TakeRecords()) {
            clean_.push_back({record.code, Kept(record.unit)});
        }
        ResetKernel();
        ResetPlatform();
    }

    // What a run without a failure records: that the source of a move has no resource file to
    // remove, where there cannot be one.
    const Records& clean() const { return clean_; }

    void Add(const FaultRule& rule) { rules_.push_back(rule); }
    void Add(const char* call, const char* with, std::vector<int> errors, const Outcome& outcome,
             int ordinal = 0) {
        Add({.call = call, .with = with, .ordinal = ordinal, .errors = errors, .outcome = outcome});
    }

    // A success, whose files are as without the failure.
    Outcome Done(Records records = {}) const {
        records.insert(records.end(), clean_.begin(), clean_.end());
        return {.result = 0, .records = records, .files = Files::kDone};
    }
    // A success that leaves something out.
    Outcome Gone(Records records = {}) const {
        Outcome outcome = Done(records);
        outcome.files = Files::kAnything;
        return outcome;
    }

    // Of those before the first call that has `mark` in it.
    int CountBefore(const std::string& mark, const char* call, const std::string& with) const {
        const auto end = std::find_if(calls_.begin(), calls_.end(), [&](const std::string& text) {
            return text.find(mark) != text.npos;
        });
        return static_cast<int>(std::count_if(calls_.begin(), end, [&](const std::string& text) {
            return text.starts_with(std::string(call) + "(") && text.find(with) != text.npos;
        }));
    }
    // Of calls whose text has `with` in it; of all of them with neither.
    int Count(const char* call, const std::string& with = "") const {
        int count = 0;
        for (const std::string& text : calls_) {
            const bool named = *call == '\0' || text.starts_with(std::string(call) + "(");
            if (named && text.find(with) != text.npos) ++count;
        }
        return count;
    }

    // The rules that some failure of this way needs: tables are put together from those of the
    // steps, and not every way takes every step.
    Rules Used() const {
        std::vector<bool> used(rules_.size());
        for (size_t at = 0; at < calls_.size(); ++at) {
            const std::string& call = calls_[at];
            std::vector<int> errors = PlausibleErrors(call);
            const bool transfer = call.starts_with("pread") || call.starts_with("pwrite") ||
                                  call.starts_with("fread") || call.starts_with("fwrite");
            if (transfer) {
                errors.insert(errors.end(), {kNoneOnce, kNone, kShortOnce, kShortThenNone});
            }
            for (const int error : errors) {
                for (size_t i = 0; i < rules_.size(); ++i) {
                    if (!Matches(rules_[i], call) || !Covers(rules_[i], error)) continue;
                    const auto end = calls_.begin() + static_cast<std::ptrdiff_t>(at) + 1;
                    const auto ordinal = std::count_if(
                        calls_.begin(), end,
                        [&](const std::string& earlier) { return Matches(rules_[i], earlier); });
                    if (rules_[i].ordinal != 0 && rules_[i].ordinal != ordinal) continue;
                    used[i] = true;
                    break;
                }
            }
        }
        Rules rules;
        for (size_t i = 0; i < rules_.size(); ++i) {
            if (used[i]) rules.push_back(rules_[i]);
        }
        return rules;
    }

 private:
    static bool Matches(const FaultRule& rule, const std::string& call) {
        return (*rule.call == '\0' || call.starts_with(std::string(rule.call) + "(")) &&
               call.find(rule.with) != call.npos;
    }
    static bool Covers(const FaultRule& rule, int error) {
        if (rule.errors.empty()) return true;
        return std::any_of(rule.errors.begin(), rule.errors.end(), [error](int wanted) {
            return wanted == error || (wanted == kShort && error > kShort && error <= kNone);
        });
    }

    const Way way_;
    std::vector<std::string> calls_;
    Records clean_;
    Rules rules_;
};

const std::vector<int> kNothing = {kNone, kNoneOnce, kShortThenNone};

// ---- Steps of several ways ----------------------------------------------------------------------

// What no result depends on, and what is done again.
void AddWhatDoesNotMatter(Table* table) {
    for (const char* call : {"pread", "pwrite"}) {
        table->Add(call, "", {EINTR, kShortOnce}, table->Done());
    }
    // Of a stream that cannot be read whole at first, what is needed to open it is read by itself.
    table->Add("pread", "(8192, 0)", {EIO, kNoneOnce}, table->Done());
    table->Add("setlock", "(2)", {}, table->Done({{0x400, "eas_lock_set"}}));
    for (const char* call : {"command", "archive", "MAVOACLSetEADirACL", "MAVOGetFSType"}) {
        table->Add(call, "", {}, table->Done());
    }
    table->Add("open", "{dir}/dst/b, ", {}, table->Done());  // for the archive bit
    table->Add("rmdir", "{dir}/src/@eaDir)", {}, table->Gone());
    table->Add("access", "MAVO:Resource", {ENOENT}, table->Done());
    // Whether a directory is there is asked once more by making it.
    table->Add("access", "{dir}/dst/@eaDir, ", {}, table->Done());
    table->Add("access", "{dir}/dst/@eaDir/b, ", {}, table->Done());
}

// The locked state, which the copy's result does not depend on; but what follows it is left out.
void AddLock(Table* table, const Way& way) {
    const auto failed = [&](const Records& records, const Lines& lines = {}) {
        Outcome outcome = {.result = 0, .records = records, .files = Files::kAnything};
        for (const std::string& line : lines) outcome.log.push_back(Kept(line));
        outcome.log.push_back(Kept("ea_copy_lock:LINE " + Quote(records) +
                                   "EACopy lock fail: from [" + kS + "] to [" + kD + "] {error}"));
        return outcome;
    };
    table->Add("access", "{dir}/src/a, ", {}, table->Gone());  // no source, no state
    table->Add("MLIBCFileStat", "", {}, [] {
        Outcome outcome = {.result = 0, .files = Files::kAnything, .any_log = true};
        return outcome;
    }());
    const bool src_mode = way.src_type == 0 || way.src_type == 7;
    const bool dst_mode = way.dst_type == 0 || way.dst_type == 7;
    if (src_mode) {
        table->Add("stat", "{dir}/src/a)", {}, failed({}), table->Count("stat", "{dir}/src/a)"));
    }
    if (dst_mode) {
        table->Add("stat", "{dir}/dst/b)", {}, failed({}), table->Count("stat", "{dir}/dst/b)"));
        table->Add("chmod", "{dir}/dst/b, ", {}, failed({{0x2A00, "ea_copy_lock"}}));
    }
    const auto record = [&](const char* file, const char* object, bool read) {
        const int last = table->Count("open", std::string(file) + ", O_RDONLY");
        if (last == 0 || !read) return;
        const Records records = {{0x900, "ea_eadirfs_adouble_read"}};
        const char* const with = Kept(std::string(file) + ", O_RDONLY");
        table->Add("open", with, {ENOENT}, table->Gone(), last);
        table->Add("open", with, {},
                   failed(records, {std::string("ea_eadirfs_adouble_read:LINE Error: open path [") +
                                    object + "] {error}"}),
                   last);
    };
    record(kSrcResource, kS, way.src_type == 1);
    record(kDstResource, kD, way.dst_type == 1 || way.dst_type == 12);
    // A file that is too short holds no record.
    table->Add("pread", "(741, 0)", kNothing, table->Gone());
    for (const char* with : {"(741, 0)", "(595, 146)", "(657, 84)"}) {
        table->Add("pread", with, {}, [] {
            Outcome outcome = {.result = 0,
                               .records = {{0xA00, "ea_eadirfs_adouble_read"}},
                               .files = Files::kAnything,
                               .any_log = true};
            return outcome;
        }());
    }
    if (way.dst_type == 2 || way.src_type == 2) {
        for (const auto& [with, object] : {std::pair{"{dir}/src/a, user.netatalk.Metadata", kS},
                                           {"{dir}/dst/b, user.netatalk.Metadata", kD}}) {
            const int last = table->Count("getxattr", with);
            if (last == 0) continue;
            table->Add("getxattr", with, {ENOENT, ENODATA}, table->Gone(), last);
            table->Add("getxattr", with, {},
                       failed({{0xA00, "ea_fileafs_adouble_read"}},
                              {std::string("ea_fileafs_adouble_read:LINE Error: getxattr path [") +
                               object + "] {error}"}),
                       last);
        }
        const char* const flush = "{dir}/dst/b, user.netatalk.Metadata";
        const int last = table->Count("setxattr", flush);
        // The first one is the copy's own.
        if (way.dst_type == 2 && last > 1) {
            table->Add("setxattr", flush, {EPERM}, failed({{0x300, "ea_fileeafs_flush"}}), last);
            table->Add("setxattr", flush, {}, failed({{0xB00, "ea_fileeafs_flush"}}), last);
        }
    }
}

// The folder's other files: whatever fails, the copy has succeeded.
void AddFolder(Table* table, const Way& way) {
    table->Add("lstat", "{dir}/src/@eaDir/a)", {}, table->Gone());  // no folder
    if (table->Count("mkdir", "{dir}/dst/@eaDir/b,") == 0) return;
    const std::string thumb =
        "ea_copy.c:LINE Failed to cp -f {dir}/src/@eaDir/a/MAVOThumb to "
        "{dir}/dst/@eaDir/b/MAVOThumb. {error}";
    const auto logged = [&](const std::string& line, bool any) {
        Outcome outcome = table->Gone();
        if (!line.empty()) outcome.log.push_back(Kept(line));
        outcome.any_log = any;
        return outcome;
    };
    table->Add("malloc", "", {}, table->Gone({{0x100, "ea_mkdir.c"}}), table->Count("malloc"));
    table->Add("mkdir", "{dir}/dst/@eaDir/b,", {EEXIST}, logged("", true));
    table->Add("mkdir", "{dir}/dst/@eaDir/b,", {}, table->Gone({{0x3C00, "ea_mkdir.c"}}));
    const int parents = table->Count("mkdir", "{dir}/dst/@eaDir,");
    Outcome unmade = table->Gone();
    unmade.any_records = true;
    table->Add("mkdir", "{dir}/dst/@eaDir,", {EEXIST}, unmade, parents);
    table->Add("mkdir", "{dir}/dst/@eaDir,", {}, table->Gone({{0x3C00, "ea_mkdir.c"}}), parents);
    if (parents == 1) {  // nothing else has made it before
        const Outcome failed = table->Gone({{0x2A00, "ea_mkdir.c"}});
        table->Add("open", "{dir}/dst/@eaDir, O_RDONLY", {}, failed);
        table->Add("fchmod", "{dir}/dst/@eaDir, ", {}, failed);
        table->Add("lstat", "{dir}/dst/@eaDir)", {}, failed);
        table->Add("fstat", "", {}, failed, table->Count("fstat") - 1);
    }
    table->Add("open", "{dir}/dst/@eaDir/b, O_RDONLY", {}, table->Gone({{0x2A00, "ea_mkdir.c"}}));
    table->Add("fchmod", "{dir}/dst/@eaDir/b, ", {}, table->Gone({{0x2A00, "ea_mkdir.c"}}));
    table->Add("lstat", "{dir}/dst/@eaDir/b)", {}, table->Gone({{0x2A00, "ea_mkdir.c"}}));
    table->Add("fstat", "", {}, table->Gone({{0x2A00, "ea_mkdir.c"}}), table->Count("fstat"));
    table->Add(
        "opendir", "{dir}/src/@eaDir/a", {},
        logged("ea_copy.c:LINE Failed to opendir {dir}/src/@eaDir/a, reason = {error}.", false));
    table->Add("readdir", "", {}, logged("", true));
    table->Add("lstat", "MAVOThumb", {ENOENT}, table->Gone());
    table->Add("lstat", "MAVOThumb", {}, logged(thumb, false));
    if (way.move != 0) {
        table->Add("MLIBCExec", "(/bin/mv", {}, logged("", true));
        table->Add("MLIBCExec", "(/bin/rm, -rf, {dir}/src/@eaDir/a)", {kExitStatus}, table->Gone());
        table->Add("MLIBCExec", "(/bin/rm, -rf, {dir}/src/@eaDir/a)", {}, logged("", true));
        table->Add("access", "{dir}/src/@eaDir/a/MAVOThumb", {}, table->Done());
    }
    table->Add("MLIBCExec", "MAVOThumb", {kExitStatus},
               way.with_callback ? logged("", true) : table->Gone());
    table->Add("MLIBCExec", "MAVOThumb", {}, logged("", true));
    table->Add("open", "{dir}/dst/@eaDir/b/MAVOThumb", {}, table->Gone());
    table->Add("fchmod", "{dir}/dst/@eaDir/b/MAVOThumb", {}, table->Gone());
}

// The rewriting of an AppleDouble file: a result for each cause, and no half of a file left.
// `wrap` gives what the routine around it makes of a result, with the lines so far.
using Wrap = std::function<Outcome(const Lines& lines, int result)>;

void AddRewriting(Table* table, const char* from, const char* to, bool attributes,
                  const Wrap& wrap) {
    const std::string name = "(EACopyAdoubleV2)";
    const auto line = [](const std::string& text) { return Line(text); };
    const char* const open_from = Kept(std::string(from) + ", O_RDONLY");
    const auto no_file = [&](Outcome outcome) {
        outcome.files = Files::kKept;
        outcome.made = {"dst/@eaDir"};
        if (std::string_view(to) == kDstDouble) outcome.made = {};
        return outcome;
    };
    // What has the same text in another step is told apart by its place.
    table->Add("open", open_from, {ENOENT}, table->Gone(), 1);
    table->Add(
        "open", open_from, {},
        no_file(wrap({line(std::string("failed to open ") + from + ", reason={error}.")}, -2)), 1);
    table->Add("open", open_from, {ENOENT}, table->Gone(), 2);
    table->Add("open", open_from, {},
               no_file(wrap({line(name + " failed to open " + from + ", reason={error}.")}, -2)),
               2);
    table->Add("open", Kept(std::string(to) + ", O_WRONLY"), {},
               no_file(wrap({line(name + " failed to open " + to + ", reason={error}.")}, -2)));

    const auto unread = [&](const char* with, const std::string& who, int ordinal) {
        const std::string text =
            (who.empty() ? "" : who + " ") + "failed to read " + from + ", reason=";
        table->Add("pread", with, {EIO}, no_file(wrap({line(text + "{error}.")}, -13)), ordinal);
        // A file that ends tells no reason.
        Outcome ended = no_file(wrap({line(text + "Success.")}, -5));
        ended.any_log = true;
        table->Add("pread", with, {}, ended, ordinal);
    };
    unread("(26, 0)", "", 1);
    unread("(26, 0)", name, 2);
    unread("(24, 26)", name, 1);
    // The table of entries that cannot be read a second time.
    for (const auto& [with, ordinal] : {std::pair{"(26, 0)", 3}, {"(24, 26)", 2}}) {
        Outcome outcome = table->Gone();
        outcome.log = {"ea_copy.c:LINE(EAGetEntriesBuf) failed to read, reason={error}."};
        table->Add("pread", with, {EIO}, outcome, ordinal);
        outcome.log = {"ea_copy.c:LINE(EAGetEntriesBuf) failed to read, reason=Success."};
        table->Add("pread", with, {kNoneOnce}, outcome, ordinal);
    }
    table->Add("pread", "(46, ", {EIO, kNoneOnce}, table->Done());  // whether the fork is blank

    const bool synced = table->Count("open", std::string(from) + ", O_RDWR") != 0;
    for (const char* with : {"(26, 0)", "(12, 26)", "(12, 38)", "(32, 50)", "(64, 82)"}) {
        const std::string_view place = with;
        // Finder info has been written before where the source itself was brought up to date.
        const int nth = synced && place == "(32, 50)" ? 2 : 1;
        const bool area = place == "(32, 50)" || place == "(64, 82)";
        const std::string text =
            name + (area ? " failed to write " : " failed to write to ") + to + ", reason=";
        table->Add("pwrite", with, {ENOSPC}, no_file(wrap({line(text + "{error}.")}, -9)), nth);
        table->Add("pwrite", with, {EIO}, no_file(wrap({line(text + "{error}.")}, -13)), nth);
        Outcome partly =
            no_file(wrap({line(text)}, -13));  // writing nothing is an input/output error
        partly.any_log = true;
        table->Add("pwrite", with, {}, partly, nth);
    }
    const auto area = [&](const char* offset, const char* length) {
        const char* const read = Kept(std::string("(") + length + ", " + offset + ")");
        table->Add("lseek", Kept(std::string("(") + offset + ", 0)"), {}, no_file(wrap({}, -13)));
        table->Add("pread", read, {EIO},
                   no_file(wrap({line(name + " failed to read " + from +
                                      ", cRead=-1, cToRead=" + length + ", reason={error}.")},
                                -13)),
                   1);
        table->Add("pread", read, {kNoneOnce}, table->Gone(), 1);  // the file ends there
    };
    area("50", "32");
    area(attributes ? "180" : "82", "64");
    table->Add("fchmod", Kept(std::string(to) + ", 0777"), {EIO}, no_file(wrap({}, -13)), 1);
    table->Add("fchmod", Kept(std::string(to) + ", 0777"), {}, no_file(wrap({}, -14)), 1);
}

// A metadata file of an EA directory as it is.
void AddSidecar(Table* table, const Way& way, const char* from, const char* to) {
    const auto failed = [&](const Records& records, bool cp) {
        Lines lines;
        if (cp) {
            lines.push_back(
                Line(Quote(records) + "Failed to cp -f " + from + " " + to + ". {error}"));
        }
        lines.push_back(Pair("Failed to cp", records));
        // From a volume of the other kind the driver says it once more.
        if (way.src_type == 2) lines.push_back(Pair("Failed to cp", records));
        return Failed(records, lines);
    };
    table->Add("access", Kept(std::string(from) + ", "), {}, table->Gone());
    // Once the directory has been made for them, both are looked at anew, and that counts.
    const char* const command = Kept(std::string(from) + ", " + to);
    const bool made = table->CountBefore(command, "lstat", std::string(to) + ")") == 2;
    for (const char* const file : {from, to}) {
        const char* const with = Kept(std::string(file) + ")");
        const int last = table->CountBefore(command, "lstat", with);
        if (made) table->Add("lstat", with, {ENOENT}, table->Done(), last);
        if (made) table->Add("lstat", with, {}, failed({}, true), last);
        table->Add("lstat", with, {}, table->Done());
    }
    // What the command leaves in errno is its own.
    Outcome by_command = failed({}, true);
    by_command.any_log = true;
    table->Add("MLIBCExec", command, {kExitStatus}, table->Gone());
    table->Add("MLIBCExec", command, {}, by_command);
    table->Add("unlink", from, {ENOENT}, table->Gone(), 1);
    table->Add("unlink", from, {}, failed({{0x2A00, "ea_copy.c"}}, false), 1);
    // The mode is what it is.
    table->Add("open", Kept(std::string(to) + ", O_RDONLY"), {}, table->Gone(), 1);
    table->Add("fchmod", to, {}, table->Gone());
}

// Adds a rule with the whole text for errors of the kernel, and one without it for what comes back
// short, which has no error to tell.
void AddExact(Table* table, const char* call, const char* with, const Outcome& outcome,
              int ordinal = 0) {
    std::vector<int> errors = {ENOMEM, EIO,   ENOSPC, EACCES, EPERM,   EMFILE,  ENOENT,
                               EROFS,  EINTR, EAGAIN, ENOLCK, ENODATA, ENOTSUP, ERANGE};
    table->Add(call, with, errors, outcome, ordinal);
    Outcome short_one = outcome;
    short_one.any_log = true;
    table->Add(call, with, {}, short_one, ordinal);
}

// The EA directory of the destination, when it is made for the first time. `result_of_none` is what
// comes of being told that somebody else made it, when nobody has.
void AddDirectory(Table* table, int result_of_none,
                  const std::function<Outcome(const Records&)>& failed) {
    table->Add(
        "mkdir", "{dir}/dst/@eaDir,", {EEXIST},
        {.result = result_of_none, .files = Files::kAnything, .any_log = true, .any_records = true},
        1);
    AddExact(table, "mkdir", "{dir}/dst/@eaDir,", failed({{0x3C00, "ea_mkdir.c"}}), 1);
    AddExact(table, "open", "{dir}/dst/@eaDir, O_RDONLY", failed({{0x2A00, "ea_mkdir.c"}}));
    AddExact(table, "fchmod", "{dir}/dst/@eaDir, ", failed({{0x2A00, "ea_mkdir.c"}}));
    AddExact(table, "lstat", "{dir}/dst/@eaDir)", failed({{0x2A00, "ea_mkdir.c"}}));
}

// The upgrade's look for an earlier layout, before a file of the current one is made over it, and
// the mode that the file is given.
void AddNewFile(Table* table, const char* file) {
    table->Add("open", Kept(std::string(file) + ", O_RDWR|O_CLOEXEC|O_NOFOLLOW"), {ENOENT},
               table->Done());
    table->Add("open", Kept(std::string(file) + ", O_RDWR|O_TRUNC|O_CLOEXEC|O_NOFOLLOW"), {ENOENT},
               table->Done());
    for (const auto& [call, with] : {std::pair{"access", Kept(std::string(file) + ", ")},
                                     {"access", "{dir}/dst/@eaDir/b/MAVO:Resource, "},
                                     {"opendir", "{dir}/dst/@eaDir/b)"},
                                     {"lstat", "{dir}/dst/._b)"}}) {
        table->Add(call, with, {ENOENT, ENOTDIR, ENAMETOOLONG}, table->Done());
        table->Add(call, with, {},
                   {.result = -1, .files = Files::kAnything, .any_log = true, .any_records = true});
    }
    table->Add("mkdir", "{dir}/dst/@eaDir,", {EEXIST}, table->Done());
    table->Add("fchmod", Kept(std::string(file) + ", "), {}, table->Gone());
}

// The attributes of one stream into another; `value_at` is where the source has the value.
void AddAttributes(Table* table, const char* value_at,
                   const std::function<Outcome(const Records&)>& failed) {
    AddExact(table, "pread", Kept(std::string("(40, ") + value_at + ")"),
             failed({{0xA00, "eas_write_to_fd"}}));
    AddExact(table, "pwrite", "(180, 0)",
             failed({{0xB00, "eas_write_header"}, {0xB00, "eas_write_to_fd"}}));
    AddExact(table, "fsync", "", failed({{0x2A00, "eas_flush"}, {0xB00, "eas_write_to_fd"}}));
    AddExact(table, "setlock", "", failed({{0x400, "eas_lock_set"}}));
    table->Add("malloc", "(1024)", {}, table->Done());  // it is tried again
}

// Finder info and flush time as the destination's attributes. `complaint` of each.
void AddRecord(Table* table, const Way& way, const char* sync, const char* stamp) {
    const char* const record = "{dir}/dst/b, user.netatalk.Metadata";
    const char* const time = "{dir}/dst/b, user.mavo.filea.flushtime";
    const auto failed = [&](const char* complaint, const Records& records) {
        return Failed(records, {Pair(complaint, records)});
    };
    if (way.src_type == 2) {  // logged only
        for (const auto& [with, ordinal] : {std::pair{record, 1}, {time, 1}, {time, 2}}) {
            Outcome outcome = table->Gone();
            outcome.any_records = true;
            outcome.any_log = true;
            table->Add("setxattr", with, {}, outcome, ordinal);
        }
        return;
    }
    table->Add("setxattr", record, {EPERM}, failed(sync, {{0x300, "ea_fileeafs_flush"}}), 1);
    AddExact(table, "setxattr", record, failed(sync, {{0xB00, "ea_fileeafs_flush"}}), 1);
    AddExact(table, "setxattr", time, failed(sync, {{0x2A00, "ea_fileeafs_write_flush_time"}}), 1);
    AddExact(table, "setxattr", time, failed(stamp, {{0x2A00, "ea_fileeafs_write_flush_time"}}), 2);
}

// The resource file of a destination with real attributes, which the sync reads.
void AddSyncRead(Table* table, const char* complaint, int ordinal) {
    const char* const with = Kept(std::string(kDstResource) + ", O_RDONLY|O_NONBLOCK|O_NOFOLLOW");
    table->Add("open", with, {ENOENT}, table->Gone(), ordinal);
    AddExact(table, "open", with, Failed({}, {Pair(complaint, {})}), ordinal);
    const Records records = {{0x400, "eas_lock_set"}};
    AddExact(table, "setlock", "(0)", Failed(records, {Pair(complaint, records)}),
             table->Count("setlock", "(0)"));
}

// Anything else that fails makes the whole fail, and that is logged.
void AddTheRest(Table* table, const Way& way) {
    // A legacy file that cannot be looked for is left alone.
    Outcome legacy = table->Done();
    legacy.any_records = true;
    table->Add("access", "MAVO:Resource", {}, legacy);
    const Outcome failed = {
        .result = -1, .files = Files::kAnything, .any_log = true, .any_records = true};
    for (const char* call : {"malloc", "open", "setlock", "lseek", "pwrite", "fstat", "fsync",
                             "ftruncate", "setxattr", "getxattr", "mkdir", "fchmod"}) {
        table->Add(call, "", {}, failed);
    }
    // What real attributes become is read only where it is a new stream, of which nothing is
    // needed.
    if (way.src_type != 7 || way.dst_type != 1) table->Add("pread", "", {}, failed);
}

// Ways of fewer calls also fail with two of them.
constexpr int kFewCalls = 35;

void Sweep(const Way& way, const std::function<void(Table*)>& fill) {
    Table table(way);
    AddWhatDoesNotMatter(&table);
    AddLock(&table, way);
    AddFolder(&table, way);
    fill(&table);
    AddTheRest(&table, way);
    const std::string name =
        "from " + std::to_string(way.src_type) + " to " + std::to_string(way.dst_type) +
        (way.move != 0 ? ", move" : ", copy") + (way.with_callback ? ", by callback" : "") +
        (way.directory ? ", directory" : "") + (way.copy_eadir != 0 ? ", with the folder" : "");
    SweepFaults(
        {.name = Kept(name),
         .prepare =
             [&](FaultWorld& w) {
                 Prepare(w, way);
                 w.own = std::make_shared<Before>(Before{Snapshot(w / "src"), PiecesAt(Source(w))});
             },
         .run = [&](FaultWorld& w) { return Copy(w, way); },
         .check = [&](FaultWorld& w, const FaultRun& run) { ExpectKept(w, way, run); },
         .clean = {.records = table.clean()},
         .rules = table.Used(),
         .pairs = table.Count("") < kFewCalls});
}

const int kMoves[] = {0, 1};

// ---- The ways -----------------------------------------------------------------------------------

TEST(FaultCopyTest, FromAnAppleDoubleVolumeToAnother) {
    const Lines line = {
        Line(std::string("(EACopyADFStoADFS) Failed to cp -f ") + kSrcDouble + ".")};
    Lines lines = {"ea_copy.c:LINE(EACopyADFStoADFS) Failed to cp -f {dir}/src/._a."};
    for (const int move : kMoves) {
        Sweep({.src_type = 0, .dst_type = 0, .move = move}, [&](Table* table) {
            for (const char* file : {"{dir}/src/._a)", "{dir}/dst/._b)"}) {
                table->Add("lstat", file, {ENOENT}, table->Done());
                table->Add("lstat", file, {}, Failed({}, lines));
            }
            table->Add("MLIBCExec", "/bin/cp", {kExitStatus}, table->Gone());
            Outcome failed = Failed({}, lines);
            failed.any_log = true;
            table->Add("MLIBCExec", "/bin/cp", {}, failed);
            table->Add("unlink", kSrcDouble, {ENOENT}, table->Gone());
            table->Add(
                "unlink", kSrcDouble, {},
                Failed({}, {Line("[0x0000 :LINE]Failed to remove [{dir}/src/._a]. {error}")}));
            table->Add("unlink", "()", {}, table->Done());
        });
    }
}

// How a way ends whose routine says that it could not copy.
Outcome NotCopied(const Records& records) {
    return Failed(records, {Pair("Failed to cp", records)});
}

// The upgrade of the source looks for each of its files first.
void AddUpgrade(Table* table) {
    for (const auto& [file, what] :
         {std::pair{kSrcResource, "MavoResource"}, {kSrcStream, "eastream"}}) {
        table->Add("access", file, {ENOENT, ENOTDIR, ENAMETOOLONG}, table->Done(), 1);
        Outcome logged = table->Done({{0x900, "ea_upgrade"}});
        logged.log = {Kept(std::string("ea_copy.c:LINE Fail to upgrde ") + what +
                           " of {dir}/src/a.[0x0900 ea_upgrade:LINE]")};
        table->Add("access", file, {}, logged, 1);
    }
}

TEST(FaultCopyTest, BetweenEADirectories) {
    for (const Way& way :
         {Way{}, Way{.move = 1}, Way{.with_callback = true}, Way{.move = 1, .with_callback = true},
          Way{.dst_type = 12}, Way{.move = 1, .directory = true}}) {
        Sweep(way, [&](Table* table) {
            AddUpgrade(table);
            AddDirectory(table, way.with_callback ? -1 : 0, NotCopied);
            AddSidecar(table, way, kSrcResource, kDstResource);
            AddSidecar(table, way, kSrcStream, kDstStream);
        });
    }
}

// The rewriting of a "._" file into a resource file, and of its attributes into a stream.
void FillFromAppleDouble(Table* table) {
    table->Add("access", kSrcDouble, {}, table->Gone());
    AddDirectory(table, -1, [](const Records& records) {
        return Failed(records, {Line("Fail to generate path." + Quote(records))});
    });
    AddRewriting(table, kSrcDouble, kDstResource, true, [](Lines lines, int result) {
        lines.push_back(Line(std::string("Failed to copy ") + kSrcDouble + " to " + kDstResource +
                             ", reason = " + std::to_string(result) + "."));
        return Failed({}, lines);
    });
    table->Add("fstat", "", {}, table->Done(), 2);  // behind that of the directory
    // The attributes.
    table->Add("open", Kept(std::string(kSrcDouble) + ", O_RDONLY"), {ENOENT}, table->Gone(), 3);
    AddExact(table, "open", Kept(std::string(kSrcDouble) + ", O_RDONLY"),
             NotCopied({{0x900, "ea_copy.c"}}), 3);
    AddNewFile(table, kDstStream);
    const char* const create = Kept(std::string(kDstStream) + ", O_RDWR|O_CREAT");
    table->Add("open", create, {ENOENT}, NotCopied({}));
    AddExact(table, "open", create, NotCopied({{0x900, "ea_copy.c"}}));
    AddExact(table, "open", Kept(std::string(kDstStream) + ", O_RDWR"),
             NotCopied({{0x900, "ea_copy.c"}}));
    AddAttributes(table, "140", NotCopied);
    table->Add("unlink", kSrcDouble, {ENOENT}, table->Gone());
    table->Add("unlink", kSrcDouble, {},
               Failed({}, {Line("[0x0000 :LINE]Failed to remove [{dir}/src/._a]. {error}")}));
    table->Add("unlink", "()", {}, table->Done());
}

TEST(FaultCopyTest, FromAnAppleDoubleVolumeToEADirectories) {
    for (const int move : kMoves) {
        Sweep({.src_type = 0, .dst_type = 1, .move = move}, FillFromAppleDouble);
    }
}

TEST(FaultCopyTest, FromAnAppleDoubleVolumeToRealAttributesBesideEADirectories) {
    for (const int move : kMoves) {
        const Way way = {.src_type = 0, .dst_type = 2, .move = move};
        Sweep(way, [&](Table* table) {
            AddRecord(table, way, "Failed ea sync", "Failed ea write time");
            AddSyncRead(table, "Failed ea sync", 1);
            FillFromAppleDouble(table);
        });
    }
}

// A destination that keeps attributes: what cannot be set is a code, and the whole fails.
void AddSetAttributes(Table* table, const char* tail = "Failed to cp", bool twice = false) {
    const auto failed = [&](const Records& records, Lines lines = {}) {
        lines.push_back(Pair(tail, records));
        if (twice) lines.push_back(Pair("Failed to cp", records));
        return Failed(records, lines);
    };
    AddExact(table, "setxattr", "{dir}/dst/b, user.k", failed({{0xB00, "ea_copy.c"}}));
    AddExact(table, "setxattr", "{dir}/dst/b, com.apple.FinderInfo",
             failed({{0xB00, "ea_copy.c"}}));
    const auto fork = [&](const char* what, const char* path) {
        return failed({{0xB00, "ea_copy.c"}}, {std::string("ea_xattr_set:LINE Fail to ") + what +
                                               "(" + path + "). {error}"});
    };
    AddExact(table, "stat", "{dir}/dst/b)", fork("stat", kD), 1);
    AddExact(table, "stat", "{dir}/dst/b/rsrc", fork("stat", "{dir}/dst/b/rsrc"));
    AddExact(table, "fopen", "{dir}/dst/b/rsrc", fork("open", "{dir}/dst/b/rsrc"));
    AddExact(table, "fwrite", "", fork("write", "{dir}/dst/b/rsrc"));
    AddExact(table, "fclose", "", fork("write", "{dir}/dst/b/rsrc"));
    AddExact(table, "pread", "(64, ", failed({{0xA00, "ea_copy.c"}}));
    AddExact(table, "pread", "(32, 50)", failed({{0xA00, "ea_copy.c"}}));
    AddExact(table, "pread", "(26, 0)", failed({{0xA00, "ea_copy.c"}}));
    AddExact(table, "pread", "(24, 26)", failed({{0xA00, "ea_copy.c"}}));
    AddExact(table, "malloc", "(1024)", failed({{0x100, "ea_copy.c"}}));
}

TEST(FaultCopyTest, FromAnAppleDoubleVolumeToRealAttributes) {
    for (const int move : kMoves) {
        Sweep({.src_type = 0, .dst_type = 7, .move = move}, [&](Table* table) {
            AddSetAttributes(table);
            table->Add("open", kSrcDouble, {ENOENT}, table->Gone());
            AddExact(table, "open", kSrcDouble, NotCopied({{0x900, "ea_copy.c"}}));
            table->Add("unlink", "", {}, table->Gone());  // no result depends on it
        });
    }
}

TEST(FaultCopyTest, FromEADirectoriesToRealAttributes) {
    for (const int move : kMoves) {
        Sweep({.src_type = 1, .dst_type = 7, .move = move}, [&](Table* table) {
            AddUpgrade(table);
            AddSetAttributes(table);
            for (const char* file : {kSrcStream, kSrcResource}) {
                const char* const with = Kept(std::string(file) + ", O_RDONLY");
                table->Add("open", with, {ENOENT}, table->Gone(), 1);
                AddExact(table, "open", with, NotCopied({{0x900, "ea_copy.c"}}), 1);
                table->Add("unlink", file, {}, table->Gone());
            }
        });
    }
}

// The rewriting of a resource file into a "._" file, and of the stream's attributes into it too.
void FillToAppleDouble(Table* table, const Way& way) {
    const bool again = way.src_type == 2;  // the driver says it once more
    const auto failed = [=](const Records& records, Lines lines, int result = -1) {
        if (again) lines.push_back(Pair("Failed to cp", records));
        return Failed(records, lines, again ? -1 : result);
    };
    Outcome unnamed = failed({}, {});
    unnamed.any_log = true;
    table->Add("MAVOStrReplaceFATReservedChar", "", {}, unnamed);
    AddRewriting(table, kSrcResource, kDstDouble, false, [&](Lines lines, int result) {
        lines.push_back(Line(std::string("Failed to copy ") + kSrcResource + " to " + kDstDouble +
                             ", reason = " + std::to_string(result) + "."));
        return failed({}, lines, result);
    });
    table->Add("fstat", "", {}, table->Done(), again ? 2 : 1);
    Outcome still_there = table->Gone();
    still_there.any_records = true;
    table->Add("unlink", kSrcResource, {ENOENT}, still_there, 1);
    table->Add("unlink", kSrcResource, {}, failed({{0x2A00, "ea_copy.c"}}, {}), 1);
    table->Add("unlink", kSrcResource, {}, table->Gone(), 2);
    const auto not_copied = [&](const Records& records) {
        return failed(records, {Pair("Failed to cp", records)});
    };
    table->Add("open", kSrcStream, {ENOENT}, table->Gone());
    AddExact(table, "open", kSrcStream, not_copied({{0x900, "ea_copy.c"}}));
    table->Add("open", Kept(std::string(kDstDouble) + ", O_RDWR"), {}, table->Done());
    // The fork makes way for the attributes; one that ends has moved.
    table->Add("pread", "(64, 82)", kNothing, table->Gone(), 2);
    const Records unmoved = {{0xB00, "eas_write_to_fd"}};
    const auto not_moved = [&](const char* what) {
        return failed(unmoved, {std::string("eas_move_rfork:LINE(EASMoveRFork) failed to ") + what +
                                    ", reason={error}.",
                                Pair("Failed to cp", unmoved)});
    };
    AddExact(table, "pread", "(64, 82)", not_moved("read, cRead=-1, cToRead=64"), 2);
    AddExact(table, "pwrite", "(64, 180)", not_moved("write"));
    AddExact(table, "ftruncate", "", not_copied(unmoved));
    AddAttributes(table, "140", not_copied);
    table->Add("unlink", kSrcStream, {ENOENT}, table->Gone(), 1);
    table->Add("unlink", kSrcStream, {}, failed({{0x2A00, "ea_copy.c"}}, {}), 1);
    table->Add("unlink", "", {}, table->Gone());
    // What becomes of the source's folder and its files, once all is carried.
    Outcome cleaned = table->Gone();
    cleaned.any_log = true;
    cleaned.any_records = true;
    for (const char* call : {"opendir", "readdir", "rmdir", "MLIBCExec", "lstat"}) {
        table->Add(call, "", {}, cleaned);
    }
    table->Add("access", kSrcStream, {}, cleaned);
}

TEST(FaultCopyTest, FromEADirectoriesToAnAppleDoubleVolume) {
    for (const int move : kMoves) {
        const Way way = {.src_type = 1, .dst_type = 0, .move = move};
        Sweep(way, [&](Table* table) {
            AddUpgrade(table);
            FillToAppleDouble(table, way);
        });
    }
}

TEST(FaultCopyTest, FromEADirectoriesToRealAttributesBesideThem) {
    for (const Way& way : {Way{.dst_type = 2}, Way{.dst_type = 2, .move = 1},
                           Way{.dst_type = 2, .move = 1, .with_callback = true}}) {
        Sweep(way, [&](Table* table) {
            AddUpgrade(table);
            AddDirectory(table, -1, [](const Records& records) {
                return Failed(records, {Line(std::string("Fail to generate path of ") + kD + ".")});
            });
            table->Add("access", kSrcResource, {}, table->Gone(), 2);
            AddRewriting(table, kSrcResource, kDstResource, false, [](Lines lines, int result) {
                lines.push_back(Line(std::string("Failed to copy ") + kSrcResource + " to " +
                                     kDstResource + ", reason = " + std::to_string(result) + "."));
                return Failed({}, lines);
            });
            table->Add("fstat", "", {}, table->Done(), 2);
            table->Add("unlink", kSrcResource, {ENOENT}, table->Gone());
            table->Add("unlink", kSrcResource, {},
                       Failed({}, {Line(std::string("[0x0000 :LINE]Failed to remove [") +
                                        kSrcResource + "]. {error}")}));
            AddSidecar(table, way, kSrcStream, kDstStream);
            // The text of the other direction.
            AddRecord(table, way, "Failed file sync", "Failed ea write time");
            AddSyncRead(table, "Failed file sync", 1);
        });
    }
}

// ---- From volumes that keep the record as a real attribute --------------------------------------

// Finder info from the source's record into its resource file, before anything is carried.
void AddFileSync(Table* table) {
    const char* const record = "{dir}/src/a, user.netatalk.Metadata";
    const auto failed = [](const Records& records, Lines lines) {
        lines.push_back(Pair("Failed file sync", records));
        return Failed(records, lines);
    };
    table->Add("getxattr", record, {ENOENT, ENODATA}, table->Gone(), 1);
    AddExact(table, "getxattr", record,
             failed({{0xA00, "ea_fileafs_adouble_read"}},
                    {"ea_fileafs_adouble_read:LINE Error: getxattr path [{dir}/src/a] {error}"}),
             1);
    table->Add("mkdir", "{dir}/src/@eaDir", {EEXIST}, table->Done());
    AddExact(table, "mkdir", "{dir}/src/@eaDir", failed({{0x3C00, "ea_mkdir.c"}}, {}));
    AddExact(table, "lseek", "(50, 0)",
             failed({{0xD00, "ea_eadirfs_finfo_write"}},
                    {"ea_eadirfs_finfo_write:LINE Error: lseek error ({error})"}),
             1);
    const char* const open = Kept(std::string(kSrcResource) + ", O_RDWR");
    table->Add("open", open, {ENOENT}, table->Gone(), 1);
    AddExact(table, "open", open, failed({}, {}), 1);
    AddExact(table, "setlock", "(1)", failed({{0x400, "eas_lock_set"}}, {}), 1);
    // A file that cannot be told to be the one that was opened is opened anew.
    table->Add("fstat", "", {}, table->Done(), 1);
    table->Add("lstat", Kept(std::string(kSrcResource) + ")"), {}, table->Done(), 1);
    AddExact(table, "pwrite", "(32, 50)", failed({{0xB00, "ea_eadirfs_finfo_write"}}, {}), 1);
    // A record that has been carried is not kept at both ends.
    table->Add("removexattr", "", {ENOENT, ENODATA}, table->Gone());
    table->Add("removexattr", "", {},
               Failed({}, {Line("[0x0000 :LINE]remove xattr from [{dir}/src/a] {error}")}));
}

TEST(FaultCopyTest, FromRealAttributesBesideEADirectoriesToEADirectories) {
    for (const Way& way :
         {Way{.src_type = 2}, Way{.src_type = 2, .move = 1}, Way{.src_type = 2, .dst_type = 12}}) {
        Sweep(way, [&](Table* table) {
            AddFileSync(table);
            AddDirectory(table, 0, [](const Records& records) {
                return Failed(records,
                              {Pair("Failed to cp", records), Pair("Failed to cp", records)});
            });
            AddSidecar(table, way, kSrcResource, kDstResource);
            AddSidecar(table, way, kSrcStream, kDstStream);
        });
    }
}

TEST(FaultCopyTest, BetweenRealAttributesBesideEADirectories) {
    for (const int move : kMoves) {
        const Way way = {.src_type = 2, .dst_type = 2, .move = move};
        Sweep(way, [&](Table* table) {
            AddRecord(table, way, "Failed ea sync", "Failed ea write time");
            AddDirectory(table, 0, [](const Records& records) {
                return Failed(records,
                              {Pair("Failed to cp", records), Pair("Failed to cp", records)});
            });
            AddSidecar(table, way, kSrcResource, kDstResource);
            AddSidecar(table, way, kSrcStream, kDstStream);
            // The sync behind it reads the resource file; that is logged only.
            Outcome logged = table->Gone();
            logged.any_log = true;
            logged.any_records = true;
            table->Add("open", Kept(std::string(kDstResource) + ", O_RDONLY|O_NONBLOCK|O_NOFOLLOW"),
                       {}, logged);
            for (const char* call : {"setlock", "lseek", "pread"}) table->Add(call, "", {}, logged);
            for (int nth = 2; nth < table->Count("malloc"); ++nth) {
                table->Add("malloc", "", {}, logged, nth);
            }
        });
    }
}

TEST(FaultCopyTest, FromRealAttributesBesideEADirectoriesToRealAttributes) {
    for (const int move : kMoves) {
        Sweep({.src_type = 2, .dst_type = 7, .move = move}, [&](Table* table) {
            AddFileSync(table);
            AddSetAttributes(table, "Failed to cp", true);
            for (const char* file : {kSrcStream, kSrcResource}) {
                const char* const with = Kept(std::string(file) + ", O_RDONLY");
                table->Add("open", with, {ENOENT}, table->Gone(), 1);
                const Records records = {{0x900, "ea_copy.c"}};
                AddExact(
                    table, "open", with,
                    Failed(records, {Pair("Failed to cp", records), Pair("Failed to cp", records)}),
                    1);
                table->Add("unlink", file, {}, table->Gone());
            }
        });
    }
}

TEST(FaultCopyTest, FromRealAttributesBesideEADirectoriesToAnAppleDoubleVolume) {
    for (const int move : kMoves) {
        const Way way = {.src_type = 2, .dst_type = 0, .move = move};
        Sweep(way, [&](Table* table) {
            AddFileSync(table);
            FillToAppleDouble(table, way);
        });
    }
}

// ---- From real attributes -----------------------------------------------------------------------

// How a way from real attributes ends: where the routine has one around it, that says so too.
Outcome FromAttributesNotCopied(const Way& way, const Records& records, Lines lines = {}) {
    lines.push_back(Pair("Failed to cp", records));
    if (way.dst_type == 2) lines.push_back(Pair("Failed to cp", records));
    return Failed(records, lines);
}

// What cannot be read is logged and counted; the rest goes on, and the whole fails.
void AddGetAttributes(Table* table, const Way& way) {
    const auto not_copied = [&](const Records& records, Lines lines = {}) {
        return FromAttributesNotCopied(way, records, lines);
    };
    AddExact(table, "malloc", "(1024)", not_copied({{0x100, "ea_copy.c"}}), 1);
    table->Add("listxattr", "{dir}/src/a, 0)", {ENOENT, ENODATA}, table->Gone());
    AddExact(table, "listxattr", "", not_copied({{0x2A00, "ea_xattr_enum"}}));
    Outcome listed = not_copied({});
    listed.any_log = true;
    table->Add("MLIBCSzListAlloc", "", {}, listed);
    table->Add("MLIBCSzListPush", "", {}, listed);
    // Other attributes are read behind it, so that errno is not its own in the end.
    const auto unread = [&](const Records& records, Lines lines = {}) {
        lines.push_back(Line(Quote(records) + "Fail to get EA({dir}/src/a). {error}"));
        Outcome outcome = not_copied(records, lines);
        outcome.any_log = true;
        return outcome;
    };
    table->Add("getxattr", "{dir}/src/a", {ERANGE}, table->Done());  // asked again, with room
    AddExact(table, "getxattr", "{dir}/src/a", unread({}));
    table->Add("stat", "{dir}/src/a)", {ENOENT}, unread({{0x700, "ea_xattr_get"}}), 1);
    AddExact(table, "stat", "{dir}/src/a)", unread({{0x2700, "ea_xattr_get"}}), 1);
    table->Add("stat", "{dir}/src/a/rsrc", {ENOENT}, unread({}));
    const auto fork = [&](const char* what) {
        return unread(
            {}, {std::string("ea_xattr_get:LINE Fail to ") + what + "({dir}/src/a/rsrc). {error}"});
    };
    AddExact(table, "stat", "{dir}/src/a/rsrc", fork("stat"));
    AddExact(table, "fopen", "{dir}/src/a/rsrc", fork("open"));
    AddExact(table, "fread", "", fork("read"));
    table->Add("fclose", "", {}, table->Done(), 1);  // of what has been read
}

// Resource file and stream made of attributes; `resource` and `stream` are one file on an
// AppleDouble volume.
void AddMadeFiles(Table* table, const Way& way, const char* resource, const char* stream) {
    const auto opening = [&](const char* what, const Records& before) {
        Records records = before;
        records.push_back({0x900, "ea_copy.c"});
        return FromAttributesNotCopied(
            way, records,
            {Line(Quote(before) + "Fail to open " + what + "({dir}/dst/b). {error}")});
    };
    AddDirectory(table, -1,
                 [&](const Records& records) { return opening("mavoresource", records); });
    AddNewFile(table, resource);
    AddExact(table, "open", Kept(std::string(resource) + ", O_RDWR|O_CREAT|O_TRUNC"),
             opening("mavoresource", {}));
    AddExact(table, "open", Kept(std::string(resource) + ", O_RDWR|O_TRUNC"),
             opening("mavoresource", {}));
    for (const char* with : {"(84, 0)", "(32, 50)", "(64, 82)"}) {
        AddExact(table, "pwrite", with, FromAttributesNotCopied(way, {{0xB00, "ea_copy.c"}}));
    }
    AddNewFile(table, stream);
    AddExact(table, "open", Kept(std::string(stream) + ", O_RDWR"), opening("eastream", {}));
    AddExact(table, "setlock", "", opening("eastream", {{0x400, "eas_lock_set"}}));
    const auto writing = [&](const Records& before) {
        Records records = before;
        records.push_back({0xB00, "ea_copy.c"});
        return FromAttributesNotCopied(
            way, records, {Line(Quote(before) + "Fail to write eastream({dir}/dst/b). {error}")});
    };
    AddExact(table, "ftruncate", "", writing({}));
    AddExact(table, "pwrite", "(180, 0)", writing({{0xB00, "eas_write_header"}}));
    AddExact(table, "fsync", "", writing({{0x2A00, "eas_flush"}}), 1);
    table->Add("fsync", "", {}, table->Done({{0x2A00, "eas_flush"}}), 2);  // nobody asks for it
    // A fork that ends has moved.
    table->Add("pread", "(64, 82)", kNothing, table->Gone());
    table->Add("pread", "(64, 82)", {kShort}, table->Gone());
    Outcome moved = writing({});
    moved.log.insert(moved.log.begin(),
                     "eas_move_rfork:LINE(EASMoveRFork) failed to read, cRead=-1, cToRead=64, "
                     "reason={error}.");
    table->Add("pread", "(64, 82)", {EIO}, moved);
    moved.log.front() = "eas_move_rfork:LINE(EASMoveRFork) failed to write, reason={error}.";
    AddExact(table, "pwrite", "(64, 180)", moved);
}

// Only a move of exactly 1 removes what is beside the source, and nothing has been put there.
void AddRemoveResource(Table* table, const Way& way) {
    table->Add("unlink", kSrcResource, {ENOENT}, table->Done());
    const Records records = {{0x2A00, "ea_copy.c"}};
    Lines lines = {Pair("Failed to remove", records)};
    if (way.dst_type == 2) lines.push_back(Pair("Failed to cp", records));
    table->Add("unlink", kSrcResource, {}, Failed(records, lines));
    table->Add("unlink", "()", {}, table->Done());
}

TEST(FaultCopyTest, FromRealAttributesToEADirectories) {
    for (const int move : kMoves) {
        for (const bool directory : {false, true}) {
            const Way way = {.src_type = 7, .dst_type = 1, .move = move, .directory = directory};
            Sweep(way, [&](Table* table) {
                AddGetAttributes(table, way);
                AddMadeFiles(table, way, kDstResource, kDstStream);
                AddRemoveResource(table, way);
            });
        }
    }
}

TEST(FaultCopyTest, FromRealAttributesToThoseBesideEADirectories) {
    for (const int move : kMoves) {
        const Way way = {.src_type = 7, .dst_type = 2, .move = move};
        Sweep(way, [&](Table* table) {
            AddRecord(table, way, "Failed ea sync", "Failed ea write time");
            AddSyncRead(table, "Failed ea sync", 1);
            AddGetAttributes(table, way);
            AddMadeFiles(table, way, kDstResource, kDstStream);
            AddRemoveResource(table, way);
        });
    }
}

TEST(FaultCopyTest, FromRealAttributesToAnAppleDoubleVolume) {
    for (const int move : kMoves) {
        const Way way = {.src_type = 7, .dst_type = 0, .move = move};
        Sweep(way, [&](Table* table) {
            AddGetAttributes(table, way);
            AddMadeFiles(table, way, kDstDouble, kDstDouble);
            AddRemoveResource(table, way);
        });
    }
}

TEST(FaultCopyTest, BetweenRealAttributes) {
    for (const int move : kMoves) {
        for (const bool directory : {false, true}) {
            const Way way = {.src_type = 7, .dst_type = 7, .move = move, .directory = directory};
            Sweep(way, [&](Table* table) {
                AddGetAttributes(table, way);
                const auto unset = [](const char* name, Lines lines = {}) {
                    lines.push_back(Line(std::string("[0x0000 :LINE]Fail to set EA({dir}/dst/b, ") +
                                         name + "). {error}"));
                    lines.push_back(Pair("Failed to cp", {}));
                    return Failed({}, lines);
                };
                Outcome first = unset(kMacFinderInfo);
                first.any_log = true;  // another one is set behind it
                table->Add("setxattr", "com.apple.FinderInfo", {}, first);
                AddExact(table, "setxattr", "user.k", unset("user.k"));
                const auto fork = [&](const char* what, const char* path) {
                    return unset(kMacFork, {std::string("ea_xattr_set:LINE Fail to ") + what + "(" +
                                            path + "). {error}"});
                };
                AddExact(table, "stat", "{dir}/dst/b)", fork("stat", kD), 1);
                AddExact(table, "stat", "{dir}/dst/b/rsrc", fork("stat", "{dir}/dst/b/rsrc"));
                AddExact(table, "fopen", "{dir}/dst/b/rsrc", fork("open", "{dir}/dst/b/rsrc"));
                AddExact(table, "fwrite", "", fork("write", "{dir}/dst/b/rsrc"));
                AddExact(table, "fclose", "", fork("write", "{dir}/dst/b/rsrc"), 2);
                AddRemoveResource(table, way);
            });
        }
    }
}

}  // namespace
}  // namespace mavoea::test

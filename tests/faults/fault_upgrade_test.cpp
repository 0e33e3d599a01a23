// Every call that fails while the metadata of earlier versions is converted.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fault_sweep.h"
#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

constexpr char kUnit[] = "ea_upgrade";
constexpr char kFolder[] = "@eaDir/a";
constexpr char kColor[] = "@eaDir/a/color";
constexpr char kTags[] = "@eaDir/a/tags";
constexpr char kStream[] = "@eaDir/a@MavoEAStream";

// Reads of the attribute files' bytes, and of a stream as far as the first read goes.
constexpr char kColorBytes[] = "(9, 0)";
constexpr char kTagsBytes[] = "(8, 0)";
constexpr char kFirstBytes[] = "(8192, 0)";
constexpr char kResource[] = "@eaDir/a@MavoResource";

// Lines about a value that could not be read or written, which quote the record of the cause.
#define READ_LINE(name, code) \
    "ea_upgrade:LINE cannot read[{dir}/a][" name "] MavoErr=[" code " ea_upgrade:LINE]"
#define WRITE_LINE(record) "ea_upgrade:LINE MAVOEASWrite error, MavoErr=[" record ":LINE]"

void MakeObject(FaultWorld& w) {
    WriteFile(w / "a", Ascii("data"));
    ASSERT_EQ(0, chmod((w / "a").c_str(), 0644));
}

// An attribute's value in the stream, if there is a stream that has it. Closes the stream again,
// and with it drops the process's locks on it.
std::optional<Bytes> InStream(FaultWorld& w, const char* name) {
    const int fd = ::open((w / kStream).c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return std::nullopt;
    std::optional<Bytes> value;
    if (EASHandle* const handle = MAVOEASOpen(fd, F_RDLCK)) {
        Bytes bytes(256);
        const int length = MAVOEASRead(handle, name, bytes.data(), 256, 0);
        if (length >= 0) {
            bytes.resize(static_cast<std::size_t>(length));
            value = bytes;
        }
        MAVOEASClose(handle);
    }
    ::close(fd);
    return value;
}

// Whatever failed, each attribute is where it was or in the stream.
void ExpectNothingLost(FaultWorld& w, const FaultRun& run, const std::vector<const char*>& names) {
    for (const char* const name : names) {
        const std::string file = w / (std::string(kFolder) + "/" + name);
        const Bytes expected = Ascii(std::string("4 b ") + name);
        if (Exists(file)) {
            EXPECT_EQ(expected, ReadFile(file)) << run.call;
        } else {
            EXPECT_EQ(expected, InStream(w, name).value_or(Ascii("(none)"))) << run.call;
        }
    }
}

// An attribute file; the one that is made last comes first when the folder is read.
void MakeAttribute(FaultWorld& w, const char* name) {
    MakeDir(w / "@eaDir");
    MakeDir(w / kFolder);
    WriteFile(w / (std::string(kFolder) + "/" + name), Ascii(std::string("4 b ") + name));
}

long long UpgradeStream(FaultWorld& w) {
    return MAVOEAUpgrade((w / "a").c_str(), MAVOEA_KIND_STREAM);
}

// ---- A folder becomes a stream ------------------------------------------------------------------

// What fails leaves all as it was: nothing is decided by half of a look, and a stream that is not
// whole has no name.
Outcome Refused(ExpectedRecord record) { return {.result = -1, .records = {record}}; }

// The same of a value that could not be written.
Outcome NotWritten(ExpectedRecord record, const char* line) {
    return {.result = -1, .records = {record}, .log = {line}};
}

// A stream that cannot be given its name; that something has it cannot be, since nothing has.
Rules NotNamed(std::vector<int> errors = {}) {
    return {{.call = "link", .errors = std::move(errors), .outcome = Refused({0x900, kUnit})}};
}

// Beside the attribute files themselves.
Rules AroundTheAttributes() {
    return {
        {.call = "access",
         .with = kStream,
         .errors = {ENOENT, ENOTDIR, ENAMETOOLONG},
         .outcome = {.files = Files::kDone}},
        {.call = "access", .with = kStream, .outcome = Refused({0x900, kUnit})},
        {.call = "opendir", .errors = {ENOENT, ENOTDIR}, .outcome = {.result = 2}},
        {.call = "opendir", .outcome = Refused({0x900, kUnit})},
        {.call = "readdir", .outcome = Refused({0xA00, kUnit})},
        {.call = "lstat",
         .with = "{dir}/._a",
         .errors = {ENOENT, ENOTDIR, ENAMETOOLONG},
         .outcome = {.files = Files::kDone}},
        {.call = "lstat", .with = "{dir}/._a", .outcome = Refused({0x900, kUnit})},
        // Then the new file has a name meanwhile.
        {.call = "access", .with = "/proc/", .outcome = {.files = Files::kDone}},
        {.call = "open", .with = "O_TMPFILE", .outcome = {.files = Files::kDone}},
        {.call = "malloc", .ordinal = 1, .outcome = Refused({0x200, "eas_open"})},
        {.call = "malloc", .ordinal = 2, .outcome = Refused({0x200, "eas_alloc_entry"})},
        {.call = "setlock", .with = "(1)", .outcome = Refused({0x400, "eas_lock_set"})},
        {.call = "lseek", .outcome = Refused({0xA00, "eas_open"})},
        // It ends with the descriptor.
        {.call = "setlock",
         .outcome = {.records = {{0x400, "eas_lock_set"}}, .files = Files::kDone}},
        {.call = "pwrite", .errors = {EINTR, kShortOnce}, .outcome = {.files = Files::kDone}},
        {.call = "pwrite",
         .outcome = NotWritten({0xB00, "eas_write_header"}, WRITE_LINE("0x0B00 eas_write_header"))},
        {.call = "fsync",
         .outcome = NotWritten({0x2A00, "eas_flush"}, WRITE_LINE("0x2A00 eas_flush"))},
        {.call = "rmdir",
         .errors = {ENOTEMPTY, ENOENT},
         .outcome = {.files = Files::kDone, .made = {kFolder}}},
        {.call = "rmdir",
         .outcome = {.result = -1,
                     .records = {{0x3900, kUnit}},
                     .files = Files::kDone,
                     .made = {kFolder}}},
    };
}

// Those of "color", which is the only one.
Rules OneAttribute() {
    // It stays where it is, and the stream is empty.
    const auto skipped = [](ExpectedRecord record, const char* line) {
        return Outcome{.records = {record}, .log = {line}, .made = {kStream}};
    };
    return Rules{
               {.call = "stat",
                .with = kColor,
                .ordinal = 1,
                .errors = {ENOENT},
                .outcome = {.result = 2}},
               {.call = "stat", .with = kColor, .ordinal = 1, .outcome = Refused({0x2A00, kUnit})},
               {.call = "stat",
                .with = kColor,
                .outcome = skipped({0x2A00, kUnit}, READ_LINE("color", "0x2A00"))},
               {.call = "open",
                .with = kColor,
                .outcome = skipped({0x900, kUnit}, READ_LINE("color", "0x0900"))},
               {.call = "malloc",
                .ordinal = 3,
                .outcome = skipped({0x100, kUnit}, READ_LINE("color", "0x0100"))},
               {.call = "pread", .errors = {EINTR, kShortOnce}, .outcome = {.files = Files::kDone}},
               // Of the new stream nothing is needed.
               {.call = "pread", .with = kFirstBytes, .outcome = {.files = Files::kDone}},
               {.call = "pread",
                .with = kColorBytes,
                .outcome = skipped({0xA00, kUnit}, READ_LINE("color", "0x0A00"))},
               // Its name may not be on disk: it is in both places.
               {.call = "fsync",
                .ordinal = 2,
                .outcome = {.records = {{0x2A00, "eas_flush"}}, .made = {kStream}}},
               {.call = "unlink", .outcome = {.made = {kStream}}},
           } +
           AroundTheAttributes() +
           Rules{{.call = "malloc",
                  .outcome = NotWritten({0x200, "eas_write"}, WRITE_LINE("0x0200 eas_write"))}};
}

TEST(FaultUpgradeTest, AFolderOfOneAttribute) {
    SweepFaults({
        .name = "MAVOEAUpgrade, stream, one attribute file",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeAttribute(w, "color");
            },
        .run = UpgradeStream,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                ExpectNothingLost(w, run, {"color"});
                if (run.call.empty()) {
                    EXPECT_EQ(std::vector<std::string>{"a@MavoEAStream"}, NamesIn(w / "@eaDir"));
                }
            },
        .rules = NotNamed() + OneAttribute(),
    });
}

TEST(FaultUpgradeTest, AFileThatCannotBeReadIsSkippedAlone) {
    const auto without_color = [](ExpectedRecord record, const char* line) {
        return Outcome{.records = {record}, .log = {line}, .made = {kStream}, .gone = {kTags}};
    };
    const auto without_tags = [](ExpectedRecord record, const char* line) {
        return Outcome{.records = {record}, .log = {line}, .made = {kStream}, .gone = {kColor}};
    };
    SweepFaults({
        .name = "MAVOEAUpgrade, stream, two attribute files",
        // Of the two files, "color" is read first.
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeAttribute(w, "tags");
                MakeAttribute(w, "color");
            },
        .run = UpgradeStream,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                ExpectNothingLost(w, run, {"color", "tags"});
            },
        .rules =
            Rules{
                // The latest access counts, and both are from just now.
                {.call = "stat", .with = kColor, .ordinal = 1, .outcome = {.files = Files::kDone}},
                {.call = "stat", .with = kTags, .ordinal = 1, .outcome = {.files = Files::kDone}},
                {.call = "stat",
                 .with = kColor,
                 .outcome = without_color({0x2A00, kUnit}, READ_LINE("color", "0x2A00"))},
                {.call = "stat",
                 .with = kTags,
                 .outcome = without_tags({0x2A00, kUnit}, READ_LINE("tags", "0x2A00"))},
                {.call = "open",
                 .with = kColor,
                 .outcome = without_color({0x900, kUnit}, READ_LINE("color", "0x0900"))},
                {.call = "open",
                 .with = kTags,
                 .outcome = without_tags({0x900, kUnit}, READ_LINE("tags", "0x0900"))},
                {.call = "malloc",
                 .ordinal = 3,
                 .outcome = without_color({0x100, kUnit}, READ_LINE("color", "0x0100"))},
                {.call = "pread",
                 .errors = {EINTR, kShortOnce},
                 .outcome = {.files = Files::kDone}},
                {.call = "pread",
                 .with = kColorBytes,
                 .errors = {EIO, kNoneOnce},
                 .outcome = without_color({0xA00, kUnit}, READ_LINE("color", "0x0A00"))},
                // Nothing can be read any more.
                {.call = "pread",
                 .with = kColorBytes,
                 .outcome = {.records = {{0xA00, kUnit}, {0xA00, kUnit}},
                             .log = {READ_LINE("color", "0x0A00"), READ_LINE("tags", "0x0A00")},
                             .made = {kStream}}},
                {.call = "pread",
                 .with = kTagsBytes,
                 .outcome = without_tags({0xA00, kUnit}, READ_LINE("tags", "0x0A00"))},
                {.call = "pread", .with = kFirstBytes, .outcome = {.files = Files::kDone}},
                {.call = "pread",
                 .outcome = NotWritten({0xA00, "eas_write"}, WRITE_LINE("0x0A00 eas_write"))},
                {.call = "fsync",
                 .ordinal = 3,
                 .outcome = {.records = {{0x2A00, "eas_flush"}}, .made = {kStream}}},
                {.call = "unlink",
                 .with = kColor,
                 .outcome = {.files = Files::kDone, .made = {kFolder, kColor}}},
                {.call = "unlink",
                 .with = kTags,
                 .outcome = {.files = Files::kDone, .made = {kFolder, kTags}}},
            } +
            NotNamed() + AroundTheAttributes() +
            Rules{{.call = "malloc",
                   .outcome = NotWritten({0x200, "eas_write"}, WRITE_LINE("0x0200 eas_write"))}},
    });
}

TEST(FaultUpgradeTest, AFolderWhereThereAreNoFilesWithoutAName) {
    SweepFaults({
        .name = "MAVOEAUpgrade, stream, under a temporary name",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeAttribute(w, "color");
            },
        .run =
            [](FaultWorld& w) {
                const auto injected = Hooks().fails;
                Hooks().fails = [&](const std::string& call) {
                    const int error = injected(call);
                    const bool nameless = call.find("O_TMPFILE") != std::string::npos;
                    return error == 0 && nameless ? EOPNOTSUPP : error;
                };
                const long long result = UpgradeStream(w);
                Hooks().fails = injected;
                return result;
            },
        .check = [](FaultWorld& w, const FaultRun& run) { ExpectNothingLost(w, run, {"color"}); },
        .rules = NotNamed({EEXIST}) +
                 Rules{// A file system without links.
                       {.call = "link", .outcome = {.files = Files::kDone}},
                       {.call = "open", .with = ".mavoea-", .outcome = Refused({0x900, kUnit})},
                       {.call = "unlink",
                        .with = ".mavoea-",
                        .outcome = {.files = Files::kDone, .free = {"@eaDir/.mavoea-*"}}}} +
                 OneAttribute(),
    });
}

// ---- A "._" file becomes a stream ---------------------------------------------------------------

Bytes Sidecar() {
    StreamImage image;
    image.attributes = {{"from a Mac", Ascii("yes")}};
    image.fork = Ascii("a fork");
    return image.Build();
}

TEST(FaultUpgradeTest, AnAppleDoubleFileBecomesTheStream) {
    // What it takes to make the EA directory.
    const auto failed = [](std::vector<ExpectedRecord> records) {
        return Outcome{.result = -1, .records = std::move(records), .made = {"@eaDir"}};
    };
    SweepFaults({
        .name = "MAVOEAUpgrade, stream, from a ._ file",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                WriteFile(w / "._a", Sidecar());
                BeUser(w);
            },
        .run = UpgradeStream,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                // It is in one of the two places, whole.
                ASSERT_NE(Exists(w / "._a"), Exists(w / kStream)) << run.call;
                EXPECT_EQ(Sidecar(), ReadFile(w / (Exists(w / "._a") ? "._a" : kStream)))
                    << run.call;
            },
        .state = UserOf,
        .rules =
            {
                {.call = "access",
                 .errors = {ENOENT, ENOTDIR, ENAMETOOLONG},
                 .outcome = {.files = Files::kDone}},
                {.call = "access", .outcome = Refused({0x900, kUnit})},
                {.call = "opendir",
                 .errors = {ENOENT, ENOTDIR},
                 .outcome = {.files = Files::kDone}},
                {.call = "opendir", .outcome = Refused({0x900, kUnit})},
                {.call = "lstat",
                 .with = "{dir}/._a)",
                 .errors = {ENOENT, ENOTDIR, ENAMETOOLONG},
                 .outcome = {.result = 2}},
                {.call = "lstat", .with = "{dir}/._a)", .outcome = Refused({0x900, kUnit})},
                // One that cannot be told to be an AppleDouble file is none.
                {.call = "open", .with = "{dir}/._a, ", .outcome = {.result = 2}},
                {.call = "pread",
                 .errors = {EINTR, kShortOnce},
                 .outcome = {.files = Files::kDone}},
                {.call = "pread", .outcome = {.result = 2}},
                {.call = "lstat", .with = "{dir}/a)", .outcome = {.result = 2}},
                {.call = "seteuid",
                 .ordinal = 1,
                 .outcome = {.result = -1, .records = {{0x3C00, "ea_mkdir.c"}}}},
                {.call = "seteuid", .outcome = {.files = Files::kDone, .torn = {"(state)"}}},
                {.call = "malloc", .outcome = {.result = -1, .records = {{0x100, "ea_mkdir.c"}}}},
                {.call = "mkdir",
                 .errors = {EEXIST},
                 .outcome = {.result = -1, .records = {{0x2800, kUnit}}}},
                {.call = "mkdir", .outcome = {.result = -1, .records = {{0x3C00, "ea_mkdir.c"}}}},
                {.call = "open", .outcome = {.result = -1, .records = {{0x2A00, "ea_mkdir.c"}}}},
                {.call = "fchmod", .outcome = failed({{0x2A00, "ea_mkdir.c"}})},
                {.call = "fstat", .outcome = failed({{0x2A00, "ea_mkdir.c"}})},
                {.call = "lstat", .outcome = failed({{0x2A00, "ea_mkdir.c"}})},
                {.call = "MAVOGetFSType", .outcome = {.files = Files::kDone}},
                {.call = "MAVOACLSetEADirACL", .outcome = {.files = Files::kDone}},
                {.call = "rename", .outcome = failed({{0x2800, kUnit}})},
            },
    });
}

// Sets the access time and nothing else.
void SetAccess(const std::string& path, time_t seconds) {
    const struct timespec times[2] = {{.tv_sec = seconds, .tv_nsec = 0},
                                      {.tv_sec = 0, .tv_nsec = UTIME_OMIT}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, 0));
}

TEST(FaultUpgradeTest, OfAFolderAndAnAppleDoubleFileNeitherIsLost) {
    for (const bool folder_wins : {true, false}) {
        SweepFaults({
            .name = folder_wins ? "MAVOEAUpgrade, stream, a folder over a ._ file"
                                : "MAVOEAUpgrade, stream, a ._ file over a folder",
            .prepare =
                [](FaultWorld& w) {
                    MakeObject(w);
                    MakeAttribute(w, "color");
                    WriteFile(w / "._a", Sidecar());
                },
            // Which of the two it is may depend on what fails: the result is looked at in the
            // check.
            .run =
                [folder_wins](FaultWorld& w) {
                    // Only now: the look at the folder before the run is an access.
                    SetAccess(w / kColor, folder_wins ? 2000 : 1000);
                    SetAccess(w / "._a", folder_wins ? 1000 : 2000);
                    w.number = static_cast<int>(UpgradeStream(w));
                    return 0;
                },
            .check =
                [folder_wins](FaultWorld& w, const FaultRun& run) {
                    ExpectNothingLost(w, run, {"color"});
                    const bool adopted = !Exists(w / "._a");
                    const std::string sidecar = w / (adopted ? kStream : "._a");
                    ASSERT_TRUE(Exists(sidecar)) << run.call;
                    EXPECT_EQ(Sidecar(), ReadFile(sidecar)) << run.call;
                    EXPECT_TRUE(w.number >= -1 && w.number <= 2) << run.call;
                    if (w.number == 2 || w.number == 1) {
                        EXPECT_FALSE(Exists(w / kStream)) << run.call;
                    }
                    if (run.call.empty()) {
                        EXPECT_EQ(0, w.number);
                        EXPECT_EQ(folder_wins, !adopted);
                    }
                },
            .rules =
                {{.call = "",
                  .outcome = {.files = Files::kAnything, .any_log = true, .any_records = true}}},
        });
    }
}

// ---- Nothing to convert -------------------------------------------------------------------------

TEST(FaultUpgradeTest, NothingToConvert) {
    SweepFaults({
        .name = "MAVOEAUpgrade, stream, nothing there",
        .prepare = MakeObject,
        .run = UpgradeStream,
        .clean = {.result = 2},
        .rules =
            {
                {.call = "", .errors = {ENOENT, ENOTDIR, ENAMETOOLONG}, .outcome = {.result = 2}},
                {.call = "", .outcome = Refused({0x900, kUnit})},
            },
    });
}

TEST(FaultUpgradeTest, APathThatIsTooLong) {
    for (const char* const kind : {"MavoEAStream", "MavoResource", "MAVO:x"}) {
        const std::string name = std::string("MAVOEAUpgrade, long path, ") + kind;
        SweepFaults({
            .name = name.c_str(),
            .prepare = [](FaultWorld&) {},
            .run = [kind](FaultWorld&) { return MAVOEAUpgrade(kLongPath.c_str(), kind); },
            .clean = {.result = -1, .records = {{0xC300, "ea_path"}}},
            .rules = {{.call = "malloc",
                       .outcome = {.result = -1, .records = {{0x200, "ea_path"}}}}},
        });
    }
}

// ---- The resource file --------------------------------------------------------------------------

// Finder info that says invisible, at 50, and AFP attributes that say read-only, at 82.
Bytes LegacyResource() {
    return Hex(
        "00 05 16 07  00 02 00 00  00*16  00 02 "
        "00 00 00 09  00 00 00 32  00 00 00 20 "
        "00 00 00 0E  00 00 00 52  00 00 00 04 "
        "00*8 40 00 00*22  00 00 00 20");
}

TEST(FaultUpgradeTest, AResourceFileAndItsMarks) {
    // The file has moved; the object is as it was.
    const auto unmarked = [](std::vector<ExpectedRecord> records) {
        return Outcome{.records = std::move(records), .files = Files::kDone, .torn = {"a"}};
    };
    for (const bool directory : {false, true}) {
        SweepFaults({
            .name = directory ? "MAVOEAUpgrade, resource file of a directory"
                              : "MAVOEAUpgrade, resource file",
            .prepare =
                [directory](FaultWorld& w) {
                    if (directory) {
                        MakeDir(w / "a");
                        ASSERT_EQ(0, chmod((w / "a").c_str(), 0644));
                    } else {
                        MakeObject(w);
                    }
                    MakeDir(w / "@eaDir");
                    MakeDir(w / kFolder);
                    WriteFile(w / "@eaDir/a/MAVO:Resource", LegacyResource());
                    Hooks().command = [&w](const char*, int command) {
                        w.number = command;
                        return 0;
                    };
                },
            .run =
                [](FaultWorld& w) {
                    return MAVOEAUpgrade((w / "a").c_str(), MAVOEA_KIND_RESOURCE);
                },
            .check =
                [](FaultWorld& w, const FaultRun& run) {
                    const bool moved = Exists(w / kResource);
                    EXPECT_NE(moved, Exists(w / "@eaDir/a/MAVO:Resource")) << run.call;
                    if (moved) {
                        EXPECT_EQ(LegacyResource(), ReadFile(w / kResource)) << run.call;
                    }
                    if (run.expected == nullptr) return;
                    const bool marked = run.result >= -1 && run.expected->torn.empty() && moved;
                    EXPECT_EQ(marked ? 0444 : 0644, ModeOf(w / "a")) << run.call;
                    if (run.call.empty()) {
                        EXPECT_EQ(0x203, w.number);
                    }
                },
            .rules =
                {
                    {.call = "access",
                     .with = kResource,
                     .errors = {ENOENT},
                     .outcome = {.files = Files::kDone}},
                    {.call = "access", .with = kResource, .outcome = Refused({0x900, kUnit})},
                    {.call = "access", .errors = {ENOENT}, .outcome = {.result = 2}},
                    {.call = "access", .outcome = Refused({0x900, kUnit})},
                    {.call = "open",
                     .with = "@eaDir/a, ",
                     .outcome = {.result = -1, .records = {{0x900, kUnit}}}},
                    {.call = "rename",
                     .outcome = {.result = -1,
                                 .records = {{0x2800, kUnit}},
                                 .error = kInjectedErrno}},
                    {.call = "open", .outcome = unmarked({{0x900, kUnit}})},
                    {.call = "pread",
                     .errors = {EINTR, kShortOnce},
                     .outcome = {.files = Files::kDone}},
                    {.call = "pread", .outcome = unmarked({{0xA00, kUnit}})},
                    {.call = "MLIBCFileStat", .outcome = unmarked({})},
                    {.call = "chmod", .outcome = unmarked({})},
                    {.call = "command", .outcome = {.files = Files::kDone}},
                    {.call = "rmdir",
                     .errors = {ENOTEMPTY, ENOENT},
                     .outcome = {.files = Files::kDone, .made = {kFolder}}},
                    {.call = "rmdir",
                     .outcome = {.result = -1,
                                 .records = {{0x3900, kUnit}},
                                 .files = Files::kDone,
                                 .made = {kFolder}}},
                },
        });
    }
}

// ---- Other reserved names -----------------------------------------------------------------------

TEST(FaultUpgradeTest, AnotherReservedName) {
    SweepFaults({
        .name = "MAVOEAUpgrade, another reserved name",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeDir(w / "@eaDir");
                MakeDir(w / kFolder);
                WriteFile(w / "@eaDir/a/MAVO:x", Ascii("thumbnail"));
                Platform().exec = [](const std::vector<std::string>& argv) {
                    return rename(argv[1].c_str(), argv[2].c_str()) == 0 ? 0 : 1;
                };
            },
        .run = [](FaultWorld& w) { return MAVOEAUpgrade((w / "a").c_str(), "MAVO:x"); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ(Ascii("thumbnail"), ReadFile(w / "@eaDir/a/MAVO@x"));
                }
            },
        .rules =
            {
                {.call = "access",
                 .with = "MAVO@x",
                 .errors = {ENOENT},
                 .outcome = {.files = Files::kDone}},
                {.call = "access", .with = "MAVO@x", .outcome = Refused({0x900, kUnit})},
                {.call = "access", .errors = {ENOENT}, .outcome = {.result = 2}},
                {.call = "access", .outcome = Refused({0x900, kUnit})},
                {.call = "open",
                 .with = "@eaDir/a, ",
                 .outcome = {.result = -1, .records = {{0x900, kUnit}}}},
                {.call = "MLIBCExec", .errors = {kAnswer}, .outcome = {.result = -1}},
                // Only that it could not be run is a failure.
                {.call = "MLIBCExec"},
            },
    });
}

}  // namespace
}  // namespace mavoea::test

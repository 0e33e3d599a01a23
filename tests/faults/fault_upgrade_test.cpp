// Every call that fails while the metadata of earlier versions is converted.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <optional>
#include <string>
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
constexpr char kResource[] = "@eaDir/a@MavoResource";

// A line about a value that could not be written, which quotes the record of the cause.
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

// Up to the stream's being open. What fails here leaves everything as it is, but that an empty
// stream may have been made.
Rules UpToTheStream() {
    return {
        {.call = "access",
         .with = kStream,
         .errors = {ENOENT, ENOTDIR, ENAMETOOLONG},
         .outcome = {.files = Files::kDone}},
        // A stream that cannot be looked at is not written over.
        {.call = "access", .with = kStream, .outcome = {.result = 1}},
        // A folder that cannot be opened, or has nothing that can be looked at, has nothing.
        {.call = "opendir", .outcome = {.result = 2}},
        {.call = "stat", .with = "{dir}/._a", .outcome = {.files = Files::kDone}},
        {.call = "open", .with = kStream, .outcome = {.result = -1, .records = {{0x900, kUnit}}}},
        {.call = "malloc",
         .ordinal = 1,
         .outcome = {.result = -1, .records = {{0x200, "eas_open"}}, .free = {kStream}}},
        {.call = "malloc",
         .ordinal = 2,
         .outcome = {.result = -1, .records = {{0x200, "eas_alloc_entry"}}, .free = {kStream}}},
        {.call = "setlock",
         .ordinal = 1,
         .outcome = {.result = -1, .records = {{0x400, "eas_lock_set"}}, .free = {kStream}}},
        {.call = "lseek",
         .outcome = {.result = -1, .records = {{0xA00, "eas_open"}}, .free = {kStream}}},
        {.call = "setlock",
         .ordinal = 2,
         .outcome = {.records = {{0x400, "eas_lock_set"}}, .files = Files::kDone}},
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
        .rules = UpToTheStream() +
                 Rules{
                     {.call = "stat", .with = kColor, .ordinal = 1, .outcome = {.result = 2}},
                     // The first walk ends early, or at its end; then the second.
                     {.call = "readdir", .ordinal = 4, .outcome = {.files = Files::kDone}},
                     {.call = "readdir", .ordinal = 8, .outcome = {.files = Files::kDone}},
                     {.call = "readdir", .ordinal = 5, .outcome = {.free = {kStream}}},
                     {.call = "readdir", .ordinal = 6, .outcome = {.free = {kStream}}},
                     {.call = "readdir", .ordinal = 7, .outcome = {.free = {kStream}}},
                     {.call = "readdir", .outcome = {.result = 2}},
                     // What fails for the file leaves it where it is.
                     {.call = "stat",
                      .with = kColor,
                      .outcome = {.records = {{0x2A00, kUnit}}, .free = {kStream}}},
                     {.call = "open",
                      .with = kColor,
                      .outcome = {.records = {{0x900, kUnit}}, .free = {kStream}}},
                     {.call = "malloc",
                      .ordinal = 3,
                      .outcome = {.records = {{0x100, kUnit}}, .free = {kStream}}},
                     {.call = "pread",
                      .errors = {EINTR, kShortOnce},
                      .outcome = {.files = Files::kDone}},
                     {.call = "pread", .outcome = {.records = {{0xA00, kUnit}}, .free = {kStream}}},
                     {.call = "malloc",
                      .outcome = {.records = {{0x200, "eas_write"}},
                                  .log = {WRITE_LINE("0x0200 eas_write")},
                                  .free = {kStream}}},
                     {.call = "pwrite",
                      .errors = {EINTR, kShortOnce},
                      .outcome = {.files = Files::kDone}},
                     {.call = "pwrite",
                      .outcome = {.records = {{0xB00, "eas_write_header"}},
                                  .log = {WRITE_LINE("0x0B00 eas_write_header")},
                                  .free = {kStream}}},
                     // It is in the stream, and may not be on the disk.
                     {.call = "fsync",
                      .outcome = {.records = {{0x2A00, "eas_flush"}},
                                  .log = {WRITE_LINE("0x2A00 eas_flush")},
                                  .made = {kStream}}},
                     {.call = "unlink", .outcome = {.made = {kStream}}},
                 },
    });
}

TEST(FaultUpgradeTest, AFailureSkipsItsAttributeFileOnly) {
    // Of the two files, "color" is read first.
    const auto without_color = [](std::vector<ExpectedRecord> records,
                                  std::vector<const char*> log = {}) {
        return Outcome{.records = std::move(records),
                       .log = std::move(log),
                       .made = {kStream},
                       .gone = {kTags}};
    };
    const auto without_tags = [](std::vector<ExpectedRecord> records,
                                 std::vector<const char*> log = {}) {
        return Outcome{.records = std::move(records),
                       .log = std::move(log),
                       .made = {kStream},
                       .gone = {kColor}};
    };
    SweepFaults({
        .name = "MAVOEAUpgrade, stream, two attribute files",
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
            UpToTheStream() +
            Rules{
                // The latest access counts, and both are from just now.
                {.call = "stat", .with = kColor, .ordinal = 1, .outcome = {.files = Files::kDone}},
                {.call = "stat", .with = kTags, .ordinal = 1, .outcome = {.files = Files::kDone}},
                {.call = "readdir", .ordinal = 1, .outcome = {.result = 2}},
                {.call = "readdir", .ordinal = 2, .outcome = {.result = 2}},
                {.call = "readdir", .ordinal = 3, .outcome = {.result = 2}},
                {.call = "readdir", .ordinal = 4, .outcome = {.files = Files::kDone}},
                {.call = "readdir", .ordinal = 5, .outcome = {.files = Files::kDone}},
                {.call = "readdir", .ordinal = 9, .outcome = without_tags({})},
                {.call = "readdir", .ordinal = 10, .outcome = {.files = Files::kDone}},
                {.call = "readdir", .outcome = {.free = {kStream}}},
                {.call = "stat", .with = kColor, .outcome = without_color({{0x2A00, kUnit}})},
                {.call = "stat", .with = kTags, .outcome = without_tags({{0x2A00, kUnit}})},
                {.call = "open", .with = kColor, .outcome = without_color({{0x900, kUnit}})},
                {.call = "open", .with = kTags, .outcome = without_tags({{0x900, kUnit}})},
                {.call = "malloc", .ordinal = 3, .outcome = without_color({{0x100, kUnit}})},
                {.call = "malloc",
                 .ordinal = 4,
                 .outcome =
                     without_color({{0x200, "eas_write"}}, {WRITE_LINE("0x0200 eas_write")})},
                {.call = "malloc",
                 .ordinal = 5,
                 .outcome =
                     without_color({{0x200, "eas_write"}}, {WRITE_LINE("0x0200 eas_write")})},
                {.call = "malloc",
                 .outcome = without_tags({{0x200, "eas_write"}}, {WRITE_LINE("0x0200 eas_write")})},
                {.call = "pread",
                 .errors = {EINTR, kShortOnce},
                 .outcome = {.files = Files::kDone}},
                {.call = "pread",
                 .ordinal = 1,
                 .errors = {EIO, kNoneOnce},
                 .outcome = without_color({{0xA00, kUnit}})},
                // Nothing can be read any more.
                {.call = "pread",
                 .ordinal = 1,
                 .outcome = {.records = {{0xA00, kUnit}, {0xA00, kUnit}}, .free = {kStream}}},
                {.call = "pread", .ordinal = 2, .outcome = without_tags({{0xA00, kUnit}})},
                {.call = "pread",
                 .outcome = without_tags({{0xA00, "eas_write"}}, {WRITE_LINE("0x0A00 eas_write")})},
                {.call = "pwrite",
                 .errors = {EINTR, kShortOnce},
                 .outcome = {.files = Files::kDone}},
                {.call = "pwrite",
                 .ordinal = 1,
                 .errors = {EIO, ENOSPC, kNoneOnce},
                 .outcome = without_color({{0xB00, "eas_write_header"}},
                                          {WRITE_LINE("0x0B00 eas_write_header")})},
                // Nothing can be written any more.
                {.call = "pwrite",
                 .ordinal = 1,
                 .outcome = {.free = {kStream}, .any_log = true, .any_records = true}},
                {.call = "pwrite",
                 .outcome = without_tags({{0xB00, "eas_write_header"}},
                                         {WRITE_LINE("0x0B00 eas_write_header")})},
                {.call = "fsync",
                 .ordinal = 1,
                 .outcome = {.records = {{0x2A00, "eas_flush"}},
                             .log = {WRITE_LINE("0x2A00 eas_flush")},
                             .files = Files::kKept,
                             .made = {kStream},
                             .gone = {kTags},
                             .fsyncs_after = 1}},
                {.call = "fsync",
                 .outcome =
                     without_tags({{0x2A00, "eas_flush"}}, {WRITE_LINE("0x2A00 eas_flush")})},
                {.call = "unlink",
                 .with = kColor,
                 .outcome = {.files = Files::kDone, .made = {kFolder, kColor}}},
                {.call = "unlink",
                 .with = kTags,
                 .outcome = {.files = Files::kDone, .made = {kFolder, kTags}}},
            },
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
                {.call = "access", .outcome = {.result = 1}},
                {.call = "opendir", .outcome = {.files = Files::kDone}},
                // One that cannot be told to be an AppleDouble file is none.
                {.call = "stat", .outcome = {.result = 2}},
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
                {.call = "access", .errors = {ENOENT}, .outcome = {.result = 2}},
                {.call = "access", .outcome = {.result = 1}},
                {.call = "", .outcome = {.result = 2}},
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
                    {.call = "access", .with = kResource, .outcome = {.result = 1}},
                    {.call = "access", .errors = {ENOENT}, .outcome = {.result = 2}},
                    {.call = "access", .outcome = {.files = Files::kDone}},
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
                {.call = "access", .with = "MAVO@x", .outcome = {.result = 1}},
                {.call = "access", .errors = {ENOENT}, .outcome = {.result = 2}},
                {.call = "access", .outcome = {.files = Files::kDone}},
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

// Every call that fails while metadata follows a renamed object.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fault_sweep.h"
#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

using Names = std::vector<const char*>;

constexpr char kUnit[] = "ea_rename.c";

// Whether the platform's indexes were told that `from` has become `to`, and of nothing else.
void ExpectIndexesTold(const std::string& from, const std::string& to, const FaultRun& run,
                       bool told = true) {
    std::vector<std::string> calls = TakePlatformCalls();
    std::erase_if(calls, [](const auto& call) {
        return !call.starts_with("MLIBMavoIndexAddEx(") &&
               !call.starts_with("MLIBMavoFileIndexAdd(");
    });
    std::vector<std::string> expected;
    if (told) {
        expected = {"MLIBMavoIndexAddEx(" + to + ", " + from + ", 4, 0, 0)",
                    "MLIBMavoFileIndexAdd(" + to + ", " + from + ", 4)"};
    }
    EXPECT_EQ(expected, calls) << run.call;
}

// What does not change the result: the reports, and the archive bit.
Rules PassedOver() {
    return {
        {.call = "MLIBMavoIndexAddEx", .outcome = {.files = Files::kDone}},
        {.call = "MLIBMavoFileIndexAdd", .outcome = {.files = Files::kDone}},
        {.call = "archive", .outcome = {.files = Files::kDone}},
    };
}

// All is moved but the file `from`, which stays, and with it what is above it.
Outcome Stays(long long result, std::vector<ExpectedRecord> records, Names from, Names to,
              Names free = {}) {
    return {.result = result,
            .records = std::move(records),
            .files = Files::kDone,
            .made = std::move(from),
            .gone = std::move(to),
            .free = std::move(free)};
}

// The upgrade before a file is moved, which then stays where it is.
template <class Staying>
Rules LookedFor(const char* file, const Staying& stays) {
    return {
        {.call = "access", .with = file, .errors = {ENOENT}, .outcome = stays(0, {})},
        // What may be in an earlier layout stays.
        {.call = "access", .with = file, .outcome = stays(-1, {{0x900, "ea_upgrade"}})},
    };
}

// ---- Within a directory -------------------------------------------------------------------------

TEST(FaultRenameTest, WithinADirectory) {
    constexpr char kOldResource[] = "@eaDir/a@MavoResource";
    constexpr char kNewResource[] = "@eaDir/b@MavoResource";
    constexpr char kOldStream[] = "@eaDir/a@MavoEAStream";
    constexpr char kNewStream[] = "@eaDir/b@MavoEAStream";
    const auto resource_stays = [&](long long result, std::vector<ExpectedRecord> records) {
        return Stays(result, std::move(records), {kOldResource}, {kNewResource});
    };
    const auto stream_stays = [&](long long result, std::vector<ExpectedRecord> records) {
        return Stays(result, std::move(records), {kOldStream}, {kNewStream});
    };
    for (const int type : {1, 2, 7, -1}) {
        const std::string name = "MAVOEARename, within a directory, type " + std::to_string(type);
        Rules rules;
        if (type == -1) {
            rules.push_back({.call = "MAVOGetFSType",
                             .outcome = {.result = -1,
                                         .log = {"ea_rename.c:LINE Fail to detect FileSystem type. "
                                                 "Need ABSOLUTE PATH."}}});
        }
        SweepFaults({
            .name = name.c_str(),
            .prepare =
                [type](FaultWorld& w) {
                    const ObjectFiles files{w.dir, "a"};
                    files.MakeStream();
                    files.MakeResource();
                    if (type == 2) {
                        MakeDir(w / "b");
                    } else {
                        WriteFile(w / "b", Ascii("data"));
                    }
                    Hooks().archive = [](int) { return 0; };
                },
            .run =
                [type](FaultWorld& w) {
                    return MAVOEARename((w / "a").c_str(), (w / "b").c_str(), type, nullptr);
                },
            .check =
                [](FaultWorld& w, const FaultRun& run) {
                    ExpectIndexesTold(w / "a", w / "b", run,
                                      !run.call.starts_with("MAVOGetFSType("));
                    // Each file is in one place, whole.
                    for (const std::string kind : {"Resource", "EAStream"}) {
                        const std::string from = w / ("@eaDir/a@Mavo" + kind);
                        const std::string to = w / ("@eaDir/b@Mavo" + kind);
                        ASSERT_NE(Exists(from), Exists(to)) << run.call;
                        EXPECT_EQ(Ascii((kind == "Resource" ? "resource" : "stream") +
                                        std::string(" of a")),
                                  ReadFile(Exists(from) ? from : to));
                    }
                },
            .rules = rules + PassedOver() + LookedFor(kOldResource, resource_stays) +
                     LookedFor(kOldStream, stream_stays) +
                     Rules{
                         {.call = "stat", .outcome = {.files = Files::kDone}},
                         {.call = "rename",
                          .with = kOldResource,
                          .errors = {ENOENT},
                          .outcome = resource_stays(0, {})},
                         {.call = "rename",
                          .with = kOldResource,
                          .outcome = resource_stays(-1, {{0x2800, kUnit}})},
                         {.call = "rename",
                          .with = kOldStream,
                          .errors = {ENOENT},
                          .outcome = stream_stays(0, {})},
                         {.call = "rename",
                          .with = kOldStream,
                          .outcome = stream_stays(-1, {{0x2800, kUnit}})},
                         {.call = "open", .outcome = {.files = Files::kDone}},
                     },
        });
    }
}

// ---- Into another directory ---------------------------------------------------------------------

TEST(FaultRenameTest, IntoADirectoryThatHasNoEADirectory) {
    constexpr char kOldResource[] = "old/@eaDir/a@MavoResource";
    constexpr char kNewResource[] = "new/@eaDir/b@MavoResource";
    constexpr char kOldStream[] = "old/@eaDir/a@MavoEAStream";
    constexpr char kNewStream[] = "new/@eaDir/b@MavoEAStream";
    const auto resource_stays = [&](long long result, std::vector<ExpectedRecord> records) {
        return Stays(result, std::move(records), {"old/@eaDir", kOldResource}, {kNewResource});
    };
    // The same, and the new directory is left as far as it went.
    const auto directory_fails = [&] {
        return Stays(-1, {{0x2A00, "ea_mkdir.c"}}, {"old/@eaDir", kOldResource}, {kNewResource},
                     {"new/@eaDir"});
    };
    const auto stream_stays = [&](long long result, std::vector<ExpectedRecord> records) {
        return Stays(result, std::move(records), {"old/@eaDir", kOldStream}, {kNewStream});
    };
    SweepFaults({
        .name = "MAVOEARename, into another directory",
        .prepare =
            [](FaultWorld& w) {
                MakeDir(w / "old");
                MakeDir(w / "new");
                const ObjectFiles files{w / "old", "a"};
                files.MakeStream();
                files.MakeResource();
                WriteFile(w / "new/b", Ascii("data"));
                BeUser(w);
                Hooks().archive = [](int) { return 0; };
            },
        .run =
            [](FaultWorld& w) {
                return MAVOEARename((w / "old/a").c_str(), (w / "new/b").c_str(), 1, nullptr);
            },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                ExpectIndexesTold(w / "old/a", w / "new/b", run);
                if (run.call.empty()) {
                    EXPECT_FALSE(Exists(w / "old/@eaDir"));
                    EXPECT_EQ(0777, ModeOf(w / "new/@eaDir"));
                }
            },
        .state = UserOf,
        .rules = PassedOver() + LookedFor(kOldResource, resource_stays) +
                 LookedFor(kOldStream, stream_stays) +
                 Rules{
                     {.call = "access", .outcome = {.files = Files::kDone}},
                     {.call = "stat", .with = kOldResource, .outcome = resource_stays(0, {})},
                     {.call = "stat", .with = kOldStream, .outcome = stream_stays(0, {})},
                     {.call = "stat", .outcome = {.files = Files::kDone}},
                     {.call = "seteuid",
                      .with = "seteuid(0)",
                      .ordinal = 1,
                      .outcome = resource_stays(-1, {{0x3C00, "ea_mkdir.c"}})},
                     {.call = "seteuid",
                      .with = "seteuid(0)",
                      .outcome = stream_stays(-1, {{0x3C00, "ea_mkdir.c"}})},
                     // Nobody is told when there is no way back.
                     {.call = "seteuid", .outcome = {.files = Files::kDone, .torn = {"(state)"}}},
                     {.call = "malloc",
                      .ordinal = 1,
                      .outcome = resource_stays(-1, {{0x100, "ea_mkdir.c"}})},
                     {.call = "malloc", .outcome = stream_stays(-1, {{0x100, "ea_mkdir.c"}})},
                     // Said to be there: the resource file finds no place, which is as if it had
                     // been missing itself.
                     {.call = "mkdir",
                      .ordinal = 1,
                      .errors = {EEXIST},
                      .outcome = resource_stays(0, {})},
                     {.call = "mkdir",
                      .ordinal = 1,
                      .outcome = resource_stays(-1, {{0x3C00, "ea_mkdir.c"}})},
                     {.call = "mkdir", .errors = {EEXIST}, .outcome = {.files = Files::kDone}},
                     {.call = "mkdir", .outcome = stream_stays(-1, {{0x3C00, "ea_mkdir.c"}})},
                     {.call = "open", .with = "{dir}/new/b, ", .outcome = {.files = Files::kDone}},
                     {.call = "open", .outcome = directory_fails()},
                     {.call = "fchmod", .outcome = directory_fails()},
                     {.call = "fstat", .outcome = directory_fails()},
                     {.call = "lstat", .outcome = directory_fails()},
                     {.call = "MAVOGetFSType", .outcome = {.files = Files::kDone}},
                     {.call = "MAVOACLSetEADirACL", .outcome = {.files = Files::kDone}},
                     {.call = "rename",
                      .with = kOldResource,
                      .errors = {ENOENT},
                      .outcome = resource_stays(0, {})},
                     {.call = "rename",
                      .with = kOldResource,
                      .outcome = resource_stays(-1, {{0x2800, kUnit}})},
                     {.call = "rename",
                      .with = kOldStream,
                      .errors = {ENOENT},
                      .outcome = stream_stays(0, {})},
                     {.call = "rename",
                      .with = kOldStream,
                      .outcome = stream_stays(-1, {{0x2800, kUnit}})},
                     {.call = "rmdir", .ordinal = 1, .outcome = {.files = Files::kDone}},
                     {.call = "rmdir",
                      .errors = {ENOENT, ENOTEMPTY},
                      .outcome = {.files = Files::kDone, .made = {"old/@eaDir"}}},
                     {.call = "rmdir", .outcome = {.files = Files::kDone}},
                 },
    });
}

// ---- To another volume --------------------------------------------------------------------------

TEST(FaultRenameTest, ToAnotherVolume) {
    // Where the renamed object came from. Every run finds it under the same path.
    const TempDir former;
    struct stat one;
    struct stat other;
    if (stat(former.path().c_str(), &one) != 0 || stat("/dev/shm", &other) != 0 ||
        one.st_dev == other.st_dev) {
        GTEST_SKIP() << "temporary files are on the volume that /dev/shm is on";
    }
    constexpr char kNewResource[] = "@eaDir/b@MavoResource";
    constexpr char kNewStream[] = "@eaDir/b@MavoEAStream";
    // The state says what the other volume holds.
    const auto resource_stays = [&](long long result, std::vector<ExpectedRecord> records) {
        return Stays(result, std::move(records), {"(state)"}, {kNewResource});
    };
    const auto stream_stays = [&](long long result, std::vector<ExpectedRecord> records) {
        return Stays(result, std::move(records), {"(state)"}, {kNewStream});
    };
    SweepFaults({
        .name = "MAVOEARename, to another volume",
        .prepare =
            [&former](FaultWorld& w) {
                std::filesystem::remove_all(former / "@eaDir");
                const ObjectFiles files{former.path(), "a"};
                files.MakeStream();
                files.MakeResource();
                WriteFile(w / "b", Ascii("data"));
                MakeDir(w / "@eaDir");
                Hooks().archive = [](int) { return 0; };
                Platform().exec = [](const std::vector<std::string>& argv) {
                    if (argv.size() != 3 || argv[0] != "/bin/mv") return 99;
                    WriteFile(argv[2], ReadFile(argv[1]));
                    return unlink(argv[1].c_str()) == 0 ? 0 : 98;
                };
            },
        .run =
            [&former](FaultWorld& w) {
                return MAVOEARename((former / "a").c_str(), (w / "b").c_str(), 1, nullptr);
            },
        .check =
            [&former](FaultWorld& w, const FaultRun& run) {
                for (const std::string kind : {"Resource", "EAStream"}) {
                    const std::string from = former / ("@eaDir/a@Mavo" + kind);
                    const std::string to = w / ("@eaDir/b@Mavo" + kind);
                    ASSERT_NE(Exists(from), Exists(to)) << run.call;
                    EXPECT_EQ(
                        Ascii((kind == "Resource" ? "resource" : "stream") + std::string(" of a")),
                        ReadFile(Exists(from) ? from : to));
                }
            },
        .state =
            [&former](FaultWorld&) {
                std::string all;
                for (const std::string& name : Tree(former.path())) all += name + "\n";
                return all;
            },
        .rules = PassedOver() + LookedFor("a@MavoResource", resource_stays) +
                 LookedFor("a@MavoEAStream", stream_stays) +
                 Rules{
                     {.call = "access", .outcome = {.files = Files::kDone}},
                     {.call = "stat", .with = "a@MavoResource", .outcome = resource_stays(0, {})},
                     {.call = "stat", .with = "a@MavoEAStream", .outcome = stream_stays(0, {})},
                     {.call = "stat", .outcome = {.files = Files::kDone}},
                     {.call = "malloc",
                      .ordinal = 1,
                      .outcome = resource_stays(-1, {{0x100, "ea_mkdir.c"}})},
                     {.call = "malloc", .outcome = stream_stays(-1, {{0x100, "ea_mkdir.c"}})},
                     {.call = "mkdir", .errors = {EEXIST}, .outcome = {.files = Files::kDone}},
                     {.call = "mkdir",
                      .ordinal = 1,
                      .outcome = resource_stays(-1, {{0x3C00, "ea_mkdir.c"}})},
                     {.call = "mkdir", .outcome = stream_stays(-1, {{0x3C00, "ea_mkdir.c"}})},
                     {.call = "rename",
                      .with = "a@MavoResource",
                      .errors = {ENOENT},
                      .outcome = resource_stays(0, {})},
                     {.call = "rename",
                      .with = "a@MavoResource",
                      .outcome = resource_stays(-1, {{0x2800, kUnit}})},
                     {.call = "rename", .errors = {ENOENT}, .outcome = stream_stays(0, {})},
                     {.call = "rename", .outcome = stream_stays(-1, {{0x2800, kUnit}})},
                     // A target that cannot be told to be a file is not moved over.
                     {.call = "lstat",
                      .ordinal = 1,
                      .errors = {ENOENT},
                      .outcome = {.files = Files::kDone}},
                     {.call = "lstat",
                      .with = "b@MavoResource",
                      .outcome = resource_stays(-1, {{0x2800, kUnit}})},
                     {.call = "lstat", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
                     {.call = "lstat", .outcome = stream_stays(-1, {{0x2800, kUnit}})},
                     // The program's exit status is the result, and both lines are recorded.
                     {.call = "MLIBCExec",
                      .with = "a@MavoResource",
                      .errors = {kExitStatus},
                      .outcome = resource_stays(1, {{0x2800, kUnit}, {0x2800, kUnit}})},
                     {.call = "MLIBCExec",
                      .with = "a@MavoResource",
                      .outcome = resource_stays(-1, {{0x2800, kUnit}, {0x2800, kUnit}})},
                     {.call = "MLIBCExec",
                      .errors = {kExitStatus},
                      .outcome = stream_stays(1, {{0x2800, kUnit}, {0x2800, kUnit}})},
                     {.call = "MLIBCExec",
                      .outcome = stream_stays(-1, {{0x2800, kUnit}, {0x2800, kUnit}})},
                     {.call = "rmdir", .ordinal = 1, .outcome = {.files = Files::kDone}},
                     {.call = "rmdir",
                      .errors = {ENOENT, ENOTEMPTY},
                      .outcome = {.files = Files::kDone, .torn = {"(state)"}}},
                     {.call = "rmdir", .outcome = {.files = Files::kDone}},
                     {.call = "open", .outcome = {.files = Files::kDone}},
                 },
        // An exit status above 0 and a failure below add up to whatever they add up to.
        .pairs = false,
    });
}

// ---- Legacy metadata ----------------------------------------------------------------------------

TEST(FaultRenameTest, LegacyMetadataIsNeverLost) {
    const Bytes resource =
        Hex("00 05 16 07  00 02 00 00  00*16  00 01 "
            "00 00 00 09  00 00 00 26  00 00 00 20  00*32");
    SweepFaults({
        .name = "MAVOEARename, legacy metadata",
        .prepare =
            [resource](FaultWorld& w) {
                MakeDir(w / "@eaDir");
                MakeDir(w / "@eaDir/a");
                WriteFile(w / "@eaDir/a/MAVO:Resource", resource);
                WriteFile(w / "@eaDir/a/color", Ascii("blue"));
                WriteFile(w / "b", Ascii("data"));
                WriteFile(w / "a", Ascii("not gone yet"));
                Hooks().archive = [](int) { return 0; };
                Hooks().command = [](const char*, int) { return 0; };
            },
        // The result, of which only the sign is looked at, is kept for the check.
        .run =
            [](FaultWorld& w) {
                w.number = MAVOEARename((w / "a").c_str(), (w / "b").c_str(), 1, nullptr);
                return 0;
            },
        .check =
            [resource](FaultWorld& w, const FaultRun& run) {
                EXPECT_GE(0, w.number) << run.call;
                int resources = 0;
                for (const char* const place : {"@eaDir/a/MAVO:Resource", "@eaDir/b/MAVO:Resource",
                                                "@eaDir/a@MavoResource", "@eaDir/b@MavoResource"}) {
                    if (!Exists(w / place)) continue;
                    ++resources;
                    EXPECT_EQ(resource, ReadFile(w / place)) << run.call;
                }
                EXPECT_EQ(1, resources) << run.call;

                bool color = false;
                for (const char* const place : {"@eaDir/a/color", "@eaDir/b/color"}) {
                    color = color || (Exists(w / place) && ReadFile(w / place) == Ascii("blue"));
                }
                for (const char* const place : {"@eaDir/a@MavoEAStream", "@eaDir/b@MavoEAStream"}) {
                    const int fd = ::open((w / place).c_str(), O_RDONLY | O_CLOEXEC);
                    if (fd < 0) continue;
                    if (EASHandle* const handle = MAVOEASOpen(fd, F_RDLCK)) {
                        char value[8] = "";
                        color = color || (MAVOEASRead(handle, "color", value, 8, 0) == 4 &&
                                          std::string(value) == "blue");
                        MAVOEASClose(handle);
                    }
                    ::close(fd);
                }
                EXPECT_TRUE(color) << run.call;
                if (run.call.empty()) {
                    EXPECT_EQ((std::vector<std::string>{"b@MavoEAStream", "b@MavoResource"}),
                              NamesIn(w / "@eaDir"));
                }
            },
        .rules = {{.call = "",
                   .outcome = {.files = Files::kAnything, .any_log = true, .any_records = true}}},
    });
}

// ---- On AppleDouble volumes ---------------------------------------------------------------------

TEST(FaultRenameTest, OnAnAppleDoubleVolumeNothingIsAFailure) {
    // The "._" file has moved; the folder, over another one, has not.
    const auto folder_stays = [](std::vector<ExpectedRecord> records, Names log = {},
                                 Names also_gone = {}) {
        also_gone.push_back("._a");
        return Outcome{.records = std::move(records),
                       .log = std::move(log),
                       .gone = std::move(also_gone),
                       .torn = {"._b"}};
    };
    SweepFaults({
        .name = "MAVOEARename, type 0",
        .prepare =
            [](FaultWorld& w) {
                const ObjectFiles from{w.dir, "a"};
                from.MakeSidecar();
                from.MakeLegacy("color");
                const ObjectFiles to{w.dir, "b"};
                to.MakeObject();
                to.MakeSidecar();
                to.MakeLegacy("tags");
            },
        .run =
            [](FaultWorld& w) {
                return MAVOEARename((w / "a").c_str(), (w / "b").c_str(), 0, nullptr);
            },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                ExpectIndexesTold(w / "a", w / "b", run);
                const bool moved = !Exists(w / "._a");
                const std::string sidecar = w / (moved ? "._b" : "._a");
                ASSERT_TRUE(Exists(sidecar)) << run.call;
                EXPECT_EQ(Ascii("sidecar of a"), ReadFile(sidecar)) << run.call;
                const bool folder_moved = !Exists(w / "@eaDir/a/color");
                ASSERT_EQ(folder_moved, Exists(w / "@eaDir/b/color")) << run.call;
            },
        .rules =
            {
                {.call = "stat", .with = "{dir}/._a)"},
                {.call = "stat", .with = "{dir}/._b)", .outcome = {.files = Files::kDone}},
                {.call = "remove", .with = "{dir}/._b)"},
                {.call = "rename", .with = "{dir}/._a, ", .outcome = {.gone = {"._b"}}},
                {.call = "stat", .with = "{dir}/@eaDir/a)", .outcome = folder_stays({})},
                // What is not seen at the target is in the way there.
                {.call = "stat",
                 .with = "{dir}/@eaDir/b)",
                 .outcome = folder_stays({{0x2800, kUnit}})},
                {.call = "access",
                 .with = "{dir}/@eaDir/b, ",
                 .outcome = folder_stays({{0x2800, kUnit}})},
                {.call = "lstat", .outcome = {.files = Files::kDone}},
                {.call = "opendir",
                 .outcome = folder_stays({{0x900, "ea_remove"}, {0x2800, kUnit}})},
                {.call = "readdir", .ordinal = 4, .outcome = {.files = Files::kDone}},
                {.call = "readdir", .outcome = folder_stays({{0x3900, "ea_remove"}})},
                {.call = "unlink",
                 .outcome = folder_stays(
                     {}, {"ea_remove:LINE Fail to remove {dir}/@eaDir/b/tags. {error}"})},
                {.call = "remove",
                 .outcome = folder_stays({{0x3900, "ea_remove"}}, {}, {"@eaDir/b/tags"})},
                {.call = "rmdir", .outcome = {.files = Files::kDone}},
                {.call = "access", .outcome = {.files = Files::kDone}},
                {.call = "rename",
                 .errors = {ENOENT},
                 .outcome = folder_stays({}, {}, {"@eaDir/b", "@eaDir/b/tags"})},
                {.call = "rename",
                 .outcome = folder_stays({{0x2800, kUnit}}, {}, {"@eaDir/b", "@eaDir/b/tags"})},
                {.call = "MLIBMavoIndexAddEx", .outcome = {.files = Files::kDone}},
                {.call = "MLIBMavoFileIndexAdd", .outcome = {.files = Files::kDone}},
            },
    });
}

// ---- Long paths ---------------------------------------------------------------------------------

TEST(FaultRenameTest, FromAPathThatIsTooLong) {
    const auto failed = [](int first, int second, int third) {
        return Outcome{
            .result = -3,
            .records = {{first, "ea_path"}, {second, "ea_path"}, {third, "ea_dir_path"}}};
    };
    SweepFaults({
        .name = "MAVOEARename, long path",
        .prepare =
            [](FaultWorld& w) {
                WriteFile(w / "b", Ascii("data"));
                Hooks().archive = [](int) { return 0; };
            },
        .run =
            [](FaultWorld& w) {
                return MAVOEARename(kLongPath.c_str(), (w / "b").c_str(), 1, nullptr);
            },
        .clean = failed(0xC300, 0xC300, 0xC300),
        .rules =
            {
                {.call = "malloc", .ordinal = 1, .outcome = failed(0x200, 0xC300, 0xC300)},
                {.call = "malloc", .ordinal = 2, .outcome = failed(0xC300, 0x200, 0xC300)},
                {.call = "malloc", .ordinal = 3, .outcome = failed(0xC300, 0xC300, 0x200)},
                {.call = "", .outcome = failed(0xC300, 0xC300, 0xC300)},
            },
    });
}

}  // namespace
}  // namespace mavoea::test

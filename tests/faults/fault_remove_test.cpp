// Every call that fails while metadata is removed, and the EA directories that are left empty.

#include <errno.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fault_sweep.h"
#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

constexpr char kUnit[] = "ea_remove";

// What there is of an object "a" that has metadata in both forms of the EA directory.
constexpr char kFolder[] = "@eaDir/a";
constexpr char kColor[] = "@eaDir/a/color";
constexpr char kTags[] = "@eaDir/a/tags";
constexpr char kStream[] = "@eaDir/a@MavoEAStream";
constexpr char kResource[] = "@eaDir/a@MavoResource";

void MakeMetadata(FaultWorld& w) {
    const ObjectFiles files{w.dir, "a"};
    files.MakeStream();
    files.MakeResource();
    files.MakeLegacy("tags");
    files.MakeLegacy("color");
    Hooks().archive = [](int) { return 0; };
}
void MakeEverything(FaultWorld& w) {
    WriteFile(w / "a", Ascii("data"));
    MakeMetadata(w);
}
void MakeEverythingOfADirectory(FaultWorld& w) {
    MakeDir(w / "a");
    MakeMetadata(w);
}

// Whether the platform's indexes were told that "a" is gone, and of nothing else.
void ExpectIndexesTold(FaultWorld& w, const FaultRun& run, bool told = true) {
    std::vector<std::string> calls = TakePlatformCalls();
    std::erase_if(calls, [](const auto& call) { return call.starts_with("MAVOGetFSType("); });
    std::vector<std::string> expected;
    if (told) {
        expected = {"MLIBMavoIndexAddEx(" + w / "a" + ", NULL, 7, 0, 0)",
                    "MLIBMavoFileIndexAdd(" + w / "a" + ", NULL, 6)"};
    }
    EXPECT_EQ(expected, calls) << run.call;
}

// What does not change the result: the reports, and the archive bit.
Rules PassedOver() {
    return {
        {.call = "MLIBMavoIndexAddEx", .outcome = {.files = Files::kDone}},
        {.call = "MLIBMavoFileIndexAdd", .outcome = {.files = Files::kDone}},
        {.call = "open", .with = "{dir}/a, ", .outcome = {.files = Files::kDone}},
        {.call = "archive", .outcome = {.files = Files::kDone}},
    };
}

// The legacy folder with its two files. `result` is what a failure makes of the call, `others` what
// goes whatever becomes of the folder.
Rules RemovingTheFolder(long long result, const std::vector<const char*>& others) {
    const auto gone = [&others](std::vector<const char*> more) {
        more.insert(more.end(), others.begin(), others.end());
        return more;
    };
    return {
        // A folder that is not known to be there is not there.
        {.call = "access", .with = "{dir}/@eaDir/a, ", .outcome = {.gone = others}},
        {.call = "lstat", .with = "{dir}/@eaDir/a)", .outcome = {.files = Files::kDone}},
        // One that cannot be opened is no error, but recorded.
        {.call = "opendir",
         .with = "{dir}/@eaDir/a)",
         .ordinal = 1,
         .outcome = {.records = {{0x900, kUnit}}, .gone = others}},
        // One that cannot be read to its end, and holds files, cannot be removed.
        {.call = "readdir", .ordinal = 5, .outcome = {.files = Files::kDone}},
        {.call = "readdir",
         .outcome = {.result = result,
                     .records = {{0x3900, kUnit}},
                     .gone = others,
                     .free = {kColor, kTags}}},
        {.call = "unlink",
         .with = "/@eaDir/a/color)",
         .outcome = {.result = result,
                     .log = {"ea_remove:LINE Fail to remove {dir}/@eaDir/a/color. {error}"},
                     .gone = others,
                     .free = {kTags}}},
        {.call = "unlink",
         .with = "/@eaDir/a/tags)",
         .outcome = {.result = result,
                     .log = {"ea_remove:LINE Fail to remove {dir}/@eaDir/a/tags. {error}"},
                     .gone = others,
                     .free = {kColor}}},
        {.call = "remove",
         .with = "{dir}/@eaDir/a)",
         .outcome = {.result = result,
                     .records = {{0x3900, kUnit}},
                     .gone = gone({kColor, kTags})}},
    };
}

// The two files of the current form. `others` goes whatever becomes of them.
Rules RemovingTheFiles(const std::vector<const char*>& others) {
    const auto gone = [&others](std::vector<const char*> more) {
        more.insert(more.end(), others.begin(), others.end());
        return more;
    };
    return {
        // An EA directory that is not known to be there is not there.
        {.call = "access", .with = "{dir}/@eaDir, ", .outcome = {.gone = others}},
        {.call = "unlink",
         .with = "@MavoResource",
         .errors = {ENOENT, ENOTDIR},
         .outcome = {.gone = gone({kStream})}},
        {.call = "unlink",
         .with = "@MavoResource",
         .outcome = {.result = -1, .records = {{0x3900, kUnit}}, .gone = gone({kStream})}},
        {.call = "unlink",
         .with = "@MavoEAStream",
         .errors = {ENOENT, ENOTDIR},
         .outcome = {.gone = gone({kResource})}},
        {.call = "unlink",
         .with = "@MavoEAStream",
         .outcome = {.result = -1, .records = {{0x3900, kUnit}}, .gone = gone({kResource})}},
    };
}

// The EA directory, which goes with the last of what it held; `last` is the attempt that does it.
// What keeps it is not the caller's concern.
Rules RemovingTheDirectory(int last) {
    return {
        {.call = "rmdir",
         .ordinal = last,
         .errors = {ENOENT, ENOTEMPTY},
         .outcome = {.files = Files::kDone, .made = {"@eaDir"}}},
        {.call = "rmdir", .outcome = {.files = Files::kDone}},
        {.call = "access", .with = "/@eaDir/.cover, ", .outcome = {.files = Files::kDone}},
    };
}

const std::vector<const char*> kFolderFiles = {kFolder, kColor, kTags};
const std::vector<const char*> kBothFiles = {kStream, kResource};

// ---- MAVOEARemove, MAVOEARemoveWithoutEAStream --------------------------------------------------

TEST(FaultRemoveTest, RemovingFromAnEADirectory) {
    for (const int type : {1, 2}) {
        SweepFaults({
            .name = type == 1 ? "MAVOEARemove, type 1" : "MAVOEARemove, type 2, a directory",
            .prepare = type == 1 ? MakeEverything : MakeEverythingOfADirectory,
            .run = [type](FaultWorld& w) { return MAVOEARemove((w / "a").c_str(), type, nullptr); },
            .check =
                [](FaultWorld& w, const FaultRun& run) {
                    ExpectIndexesTold(w, run);
                    if (run.call.empty()) {
                        EXPECT_EQ(std::vector<std::string>{"a"}, NamesIn(w.dir));
                    }
                },
            .rules = PassedOver() + RemovingTheFolder(-1, kBothFiles) +
                     RemovingTheFiles(kFolderFiles) + RemovingTheDirectory(2),
        });
    }
}

TEST(FaultRemoveTest, RemovingFromAVolumeWhoseTypeIsAskedFor) {
    SweepFaults({
        .name = "MAVOEARemove, type asked for",
        .prepare = MakeEverything,
        .run =
            [](FaultWorld& w) {
                EAIndexFlags flags = {.fileIndex = 1, .index = 1};
                return MAVOEARemove((w / "a").c_str(), -1, &flags);
            },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                ExpectIndexesTold(w, run, !run.call.starts_with("MAVOGetFSType("));
            },
        .rules =
            Rules{
                {.call = "MAVOGetFSType", .outcome = {.result = -1, .records = {{0x2A00, kUnit}}}},
            } +
            PassedOver() + RemovingTheFolder(-1, kBothFiles) + RemovingTheFiles(kFolderFiles) +
            RemovingTheDirectory(2),
    });
}

TEST(FaultRemoveTest, RemovingFromAnAppleDoubleVolume) {
    for (const int type : {0, 5}) {
        SweepFaults({
            .name = type == 0 ? "MAVOEARemove, type 0" : "MAVOEARemove, type 5",
            .prepare =
                [](FaultWorld& w) {
                    const ObjectFiles files{w.dir, "a"};
                    files.MakeObject();
                    files.MakeSidecar();
                    files.MakeLegacy("tags");
                    files.MakeLegacy("color");
                },
            .run = [type](FaultWorld& w) { return MAVOEARemove((w / "a").c_str(), type, nullptr); },
            .check =
                [](FaultWorld& w, const FaultRun& run) {
                    ExpectIndexesTold(w, run);
                    if (run.call.empty()) {
                        EXPECT_EQ(std::vector<std::string>{"a"}, NamesIn(w.dir));
                    }
                },
            .rules =
                Rules{
                    {.call = "unlink",
                     .with = "{dir}/._a)",
                     .errors = {ENOENT},
                     .outcome = {.files = Files::kDone, .made = {"._a"}}},
                    {.call = "unlink",
                     .with = "{dir}/._a)",
                     .outcome = {.result = -1, .records = {{0x3900, kUnit}}}},
                    {.call = "MLIBMavoIndexAddEx", .outcome = {.files = Files::kDone}},
                    {.call = "MLIBMavoFileIndexAdd", .outcome = {.files = Files::kDone}},
                } +
                // What becomes of the folder is not the caller's concern.
                RemovingTheFolder(0, {"._a"}) +
                Rules{
                    {.call = "rmdir",
                     .errors = {ENOENT, ENOTEMPTY},
                     .outcome = {.files = Files::kDone, .made = {"@eaDir"}}},
                    {.call = "rmdir", .outcome = {.files = Files::kDone}},
                },
        });
    }
}

TEST(FaultRemoveTest, RemovingFromAnAttributeVolume) {
    SweepFaults({
        .name = "MAVOEARemove, type 7",
        .prepare = MakeEverything,
        .run = [](FaultWorld& w) { return MAVOEARemove((w / "a").c_str(), 7, nullptr); },
        .check = [](FaultWorld& w, const FaultRun& run) { ExpectIndexesTold(w, run); },
        .rules =
            {
                {.call = "MLIBMavoIndexAddEx"},
                {.call = "MLIBMavoFileIndexAdd"},
            },
    });
}

TEST(FaultRemoveTest, RemovingABareNameThatIsGone) {
    SweepFaults({
        .name = "MAVOEARemove, a bare name",
        .prepare =
            [](FaultWorld& w) {
                char former[4096];
                w.text = getcwd(former, sizeof former) != nullptr ? former : "/";
                ASSERT_EQ(0, chdir(w.dir.c_str()));
                const ObjectFiles files{w.dir, "a"};
                files.MakeStream();
            },
        .run = [](FaultWorld&) { return MAVOEARemove("a", -1, nullptr); },
        .finish = [](FaultWorld& w) { EXPECT_EQ(0, chdir(w.text.c_str())); },
        .rules =
            {
                // Whatever keeps it from being seen, it is taken to be missing.
                {.call = "access", .with = "access(a, ", .outcome = {.files = Files::kDone}},
                {.call = "getcwd",
                 .outcome = {.result = -1, .log = {"ea_remove:LINE Fail to getcwd. {error}"}}},
                {.call = "MAVOGetFSType", .outcome = {.result = -1, .records = {{0x2A00, kUnit}}}},
                {.call = "access", .with = "access(@eaDir/a, ", .outcome = {.files = Files::kDone}},
                {.call = "access", .with = "access(@eaDir, "},
                {.call = "unlink",
                 .with = "@MavoResource",
                 .errors = {ENOENT},
                 .outcome = {.files = Files::kDone}},
                {.call = "unlink",
                 .with = "@MavoResource",
                 .outcome = {.result = -1, .records = {{0x3900, kUnit}}, .gone = {kStream}}},
                {.call = "unlink", .with = "@MavoEAStream", .errors = {ENOENT}},
                {.call = "unlink",
                 .with = "@MavoEAStream",
                 .outcome = {.result = -1, .records = {{0x3900, kUnit}}}},
                {.call = "rmdir", .errors = {ENOENT, ENOTEMPTY}, .outcome = {.gone = {kStream}}},
                {.call = "rmdir", .outcome = {.files = Files::kDone}},
                {.call = "MLIBMavoIndexAddEx", .outcome = {.files = Files::kDone}},
                {.call = "MLIBMavoFileIndexAdd", .outcome = {.files = Files::kDone}},
                {.call = "open", .outcome = {.files = Files::kDone}},
            },
    });
}

TEST(FaultRemoveTest, RemovingAllButTheStream) {
    SweepFaults({
        .name = "MAVOEARemoveWithoutEAStream",
        .prepare = MakeEverything,
        .run = [](FaultWorld& w) { return MAVOEARemoveWithoutEAStream((w / "a").c_str(), 1); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                ExpectIndexesTold(w, run);
                EXPECT_TRUE(Exists(w / kStream)) << run.call;
                // From here on streams go again.
                const TempDir other;
                const ObjectFiles files{other.path(), "c"};
                files.MakeStream();
                EXPECT_EQ(0, EARemove(1, files.object().c_str())) << run.call;
                EXPECT_FALSE(Exists(files.stream())) << run.call;
            },
        .rules =
            PassedOver() + RemovingTheFolder(-1, {kResource}) +
            Rules{
                {.call = "access", .with = "{dir}/@eaDir, ", .outcome = {.gone = kFolderFiles}},
                {.call = "unlink",
                 .with = "@MavoResource",
                 .errors = {ENOENT, ENOTDIR},
                 .outcome = {.gone = kFolderFiles}},
                {.call = "unlink",
                 .with = "@MavoResource",
                 .outcome = {.result = -1, .records = {{0x3900, kUnit}}, .gone = kFolderFiles}},
                {.call = "rmdir", .outcome = {.files = Files::kDone}},
                {.call = "access", .with = "/@eaDir/.cover, ", .outcome = {.files = Files::kDone}},
            },
    });
}

TEST(FaultRemoveTest, RemovingBehindAPathThatIsTooLong) {
    SweepFaults({
        .name = "MAVOEARemove, type 1, long path",
        .prepare = [](FaultWorld&) {},
        .run = [](FaultWorld&) { return MAVOEARemove(kLongPath.c_str(), 1, nullptr); },
        .clean = {.result = -1, .records = {{0xC300, "ea_dir_path"}, {0xC300, "ea_dir_path"}}},
        .rules =
            {
                {.call = "malloc",
                 .ordinal = 1,
                 .outcome = {.result = -1,
                             .records = {{0x200, "ea_dir_path"}, {0xC300, "ea_dir_path"}}}},
                {.call = "malloc",
                 .ordinal = 2,
                 .outcome = {.result = -1,
                             .records = {{0xC300, "ea_dir_path"}, {0x200, "ea_dir_path"}}}},
                {.call = "",
                 .outcome = {.result = -1,
                             .records = {{0xC300, "ea_dir_path"}, {0xC300, "ea_dir_path"}}}},
            },
    });

    static const std::string kLongDirectories = [] {
        std::string path;
        while (path.size() < 4095) path += "/.";
        return path + "/a";
    }();
    SweepFaults({
        .name = "MAVOEARemove, type 0, long path",
        .prepare = [](FaultWorld&) {},
        .run = [](FaultWorld&) { return MAVOEARemove(kLongDirectories.c_str(), 0, nullptr); },
        .clean = {.result = -1, .records = {{0x3900, kUnit}}},
        .rules =
            {
                {.call = "malloc", .outcome = {.result = -1, .records = {{0x200, "ea_adpath"}}}},
                // What is missing is no failure; nor is a folder whose path cannot be told.
                {.call = "unlink",
                 .errors = {ENOENT},
                 .outcome = {.records = {{0xC300, "ea_dir_path"}}}},
                {.call = "", .outcome = {.result = -1, .records = {{0x3900, kUnit}}}},
            },
    });
}

// ---- EARemove -----------------------------------------------------------------------------------

TEST(FaultRemoveTest, RemovingOneForm) {
    SweepFaults({
        .name = "EARemove, folder form",
        .prepare = MakeEverything,
        .run = [](FaultWorld& w) { return EARemove(0, (w / "a").c_str()); },
        .check = [](FaultWorld& w, const FaultRun& run) { ExpectIndexesTold(w, run, false); },
        .rules =
            RemovingTheFolder(-1, {}) +
            Rules{
                {.call = "rmdir", .outcome = {.files = Files::kDone}},
                {.call = "access", .with = "/@eaDir/.cover, ", .outcome = {.files = Files::kDone}},
            },
    });
    SweepFaults({
        .name = "EARemove, file form",
        .prepare =
            [](FaultWorld& w) {
                const ObjectFiles files{w.dir, "a"};
                files.MakeStream();
                files.MakeResource();
            },
        .run = [](FaultWorld& w) { return EARemove(1, (w / "a").c_str()); },
        .check = [](FaultWorld& w, const FaultRun& run) { ExpectIndexesTold(w, run, false); },
        .rules =
            RemovingTheFiles({}) +
            Rules{
                {.call = "rmdir", .errors = {ENOENT, ENOTEMPTY}, .outcome = {.gone = kBothFiles}},
                {.call = "rmdir", .outcome = {.files = Files::kDone}},
            },
    });
}

TEST(FaultRemoveTest, RemovingAFolderThatHasSubfolders) {
    constexpr char kLine[] = "ea_remove:LINE Fail to remove {dir}/@eaDir/a/sub. Is a directory";
    SweepFaults({
        .name = "EARemove, folder form, subfolder",
        .prepare =
            [](FaultWorld& w) {
                MakeDir(w / "@eaDir");
                MakeDir(w / kFolder);
                MakeDir(w / "@eaDir/a/sub");
            },
        .run = [](FaultWorld& w) { return EARemove(0, (w / "a").c_str()); },
        .clean = {.result = -1, .log = {kLine}},
        .rules =
            {
                {.call = "access"},
                {.call = "lstat", .outcome = {.result = -1, .log = {kLine}}},
                {.call = "opendir", .outcome = {.records = {{0x900, kUnit}}}},
                {.call = "readdir", .outcome = {.result = -1, .records = {{0x3900, kUnit}}}},
                {.call = "unlink",
                 .outcome = {.result = -1,
                             .log = {"ea_remove:LINE Fail to remove {dir}/@eaDir/a/sub. "
                                     "{error}"}}},
            },
        .pairs = false,  // a folder that cannot be opened is a success
    });
}

// ---- EARemoveEADir ------------------------------------------------------------------------------

constexpr char kOpendirLine[] = "ea_remove:LINE Failed to opendir {dir}/@eaDir, reason={error}.";

TEST(FaultRemoveTest, RemovingAnEmptyEADirectory) {
    SweepFaults({
        .name = "EARemoveEADir, empty",
        .prepare = [](FaultWorld& w) { MakeDir(w / "@eaDir"); },
        .run = [](FaultWorld& w) { return EARemoveEADir((w / kStream).c_str()); },
        .rules =
            {
                {.call = "rmdir", .errors = {ENOENT}},
                {.call = "rmdir", .errors = {ENOTEMPTY}, .outcome = {.result = -1}},
                // It is looked into then, and removed all the same.
                {.call = "rmdir", .outcome = {.files = Files::kDone}},
            },
        .pairs = false,  // it is empty, whatever the first failure says
    });
}

TEST(FaultRemoveTest, RemovingAnEADirectoryThatHasACoverOnly) {
    SweepFaults({
        .name = "EARemoveEADir, .cover only",
        .prepare =
            [](FaultWorld& w) {
                MakeDir(w / "@eaDir");
                WriteFile(w / "@eaDir/.cover", Ascii("cover"));
            },
        .run = [](FaultWorld& w) { return EARemoveEADir((w / kStream).c_str()); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_FALSE(Exists(w / "@eaDir"));
                }
            },
        .rules =
            {
                {.call = "rmdir", .errors = {ENOENT}},
                {.call = "rmdir", .outcome = {.files = Files::kDone}},
                {.call = "access", .errors = {ENOENT}, .outcome = {.result = -1}},
                {.call = "access", .outcome = {.files = Files::kDone}},
                {.call = "opendir", .errors = {ENOENT}},
                {.call = "opendir", .outcome = {.result = -1, .log = {kOpendirLine}}},
                // What has not been seen whole may hold more: nothing goes.
                {.call = "readdir", .outcome = {.result = -1}},
                {.call = "stat", .outcome = {.result = -1}},
                {.call = "unlink", .outcome = {.result = -1}},
                {.call = "remove", .outcome = {.result = -1, .gone = {"@eaDir/.cover"}}},
            },
    });
}

TEST(FaultRemoveTest, AnEADirectoryThatIsInUseKeepsItsCoverWhateverFails) {
    for (const bool cover_first : {true, false}) {
        SweepFaults({
            .name = cover_first ? "EARemoveEADir, in use, .cover last"
                                : "EARemoveEADir, in use, .cover first",
            .prepare =
                [cover_first](FaultWorld& w) {
                    MakeDir(w / "@eaDir");
                    if (cover_first) WriteFile(w / "@eaDir/.cover", Ascii("cover"));
                    WriteFile(w / kStream, Ascii("of another object"));
                    if (!cover_first) WriteFile(w / "@eaDir/.cover", Ascii("cover"));
                },
            .run = [](FaultWorld& w) { return EARemoveEADir((w / kStream).c_str()); },
            .clean = {.result = -1},
            .rules =
                {
                    {.call = "rmdir", .errors = {ENOENT}},
                    {.call = "opendir", .errors = {ENOENT}},
                    {.call = "opendir", .outcome = {.result = -1, .log = {kOpendirLine}}},
                    {.call = "", .outcome = {.result = -1}},
                },
        });
    }
}

// ---- MAVOEARemoveDanglingEADir ------------------------------------------------------------------

constexpr char kDanglingLine[] =
    "ea_remove_dangling_eadir:LINE failed to opendir [{dir}/d], errno={error}";

long long RemoveDangling(FaultWorld& w) {
    MAVOEARemoveDanglingEADir((w / "d").c_str());
    return 0;
}

TEST(FaultRemoveTest, RemovingADanglingEADirectory) {
    SweepFaults({
        .name = "MAVOEARemoveDanglingEADir",
        .prepare =
            [](FaultWorld& w) {
                MakeDir(w / "d");
                MakeDir(w / "d/@eaDir");
                WriteFile(w / "d/@eaDir/gone@MavoEAStream", Ascii("stream"));
            },
        .run = RemoveDangling,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ(std::vector<std::string>{}, NamesIn(w / "d"));
                }
            },
        .rules =
            {
                {.call = "opendir", .outcome = {.log = {kDanglingLine}}},
                // What has not been seen whole may hold more.
                {.call = "readdir"},
                {.call = "malloc"},
                {.call = "MLIBCExec"},
            },
    });
}

TEST(FaultRemoveTest, AnEADirectoryWhoseObjectsAreThereStaysWhateverFails) {
    for (const bool object_first : {true, false}) {
        SweepFaults({
            .name = object_first ? "MAVOEARemoveDanglingEADir, in use, older object"
                                 : "MAVOEARemoveDanglingEADir, in use, newer object",
            .prepare =
                [object_first](FaultWorld& w) {
                    MakeDir(w / "d");
                    if (object_first) WriteFile(w / "d/object", Ascii("data"));
                    MakeDir(w / "d/@eaDir");
                    WriteFile(w / "d/@eaDir/object@MavoEAStream", Ascii("stream"));
                    if (!object_first) WriteFile(w / "d/object", Ascii("data"));
                },
            .run = RemoveDangling,
            .rules =
                {
                    {.call = "opendir", .outcome = {.log = {kDanglingLine}}},
                    {.call = ""},
                },
        });
    }
}

}  // namespace
}  // namespace mavoea::test

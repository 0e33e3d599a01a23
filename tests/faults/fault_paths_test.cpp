// Every call that fails while paths are derived, EA directories made, metadata files opened, and
// names looked at.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <deque>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fault_sweep.h"

namespace mavoea::test {
namespace {

constexpr ExpectedRecord kNoMemory = {0x100, "ea_mkdir.c"};
constexpr ExpectedRecord kNotMade = {0x3C00, "ea_mkdir.c"};
constexpr ExpectedRecord kNotOpened = {0x2A00, "ea_mkdir.c"};

// ---- Paths ----

// Longer than what is derived on the stack, of names that a "._" file can have.
std::string LongPath() {
    std::string path;
    while (path.size() < 4100) path += "/" + std::string(99, 'd');
    return path;
}

FaultCase Derivation(const char* name, int (*derive)(const char*, char*), Outcome clean,
                     const char* unit) {
    return {.name = name,
            .prepare = [](FaultWorld& w) { w.buffer.resize(4096); },
            .run =
                [derive](FaultWorld& w) {
                    return derive(LongPath().c_str(), reinterpret_cast<char*>(w.buffer.data()));
                },
            .clean = clean,
            .rules = {{.call = "malloc", .outcome = {.result = -1, .records = {{0x200, unit}}}}}};
}

TEST(PathFaults, AnEaDirectorysLongPathNeedsMemory) {
    SweepFaults(Derivation(
        "dir path", [](const char* p, char* b) { return MAVOEADirPath(1, p, b, 4095); },
        {.result = -1, .records = {{0xC300, "ea_dir_path"}}, .error = ENAMETOOLONG},
        "ea_dir_path"));
}

TEST(PathFaults, AMetadataFilesLongPathNeedsMemory) {
    SweepFaults(Derivation(
        "path in the EA directory",
        [](const char* p, char* b) { return MAVOEAPathNoADFS(1, p, "MavoEAStream", b, 4095); },
        {.result = -1, .records = {{0xC300, "ea_path"}}, .error = ENAMETOOLONG}, "ea_path"));
    SweepFaults(Derivation(
        "path, EA directory",
        [](const char* p, char* b) { return MAVOEAPath(0, p, "MAVO:Resource", b, 4095, 0); },
        {.result = -1, .records = {{0xC300, "ea_path"}}, .error = ENAMETOOLONG}, "ea_path"));
}

TEST(PathFaults, AnAppleDoubleFilesLongPathNeedsMemory) {
    SweepFaults(Derivation(
        "path beside", [](const char* p, char* b) { return MAVOEAADPath(p, b, 4095); }, {},
        "ea_adpath"));
    SweepFaults(Derivation(
        "path, beside",
        [](const char* p, char* b) { return MAVOEAPath(1, p, "MavoEAStream", b, 4095, 1); }, {},
        "ea_adpath"));
}

// ---- EA directories ----

// Rules hold pointers: a text that is there for good.
const char* Kept(const std::string& text) {
    static std::deque<std::string>& texts = *new std::deque<std::string>;
    return texts.emplace_back(text).c_str();
}

// Of a directory that MAVOEAMKDir makes: `name` of it and of `above`, made before, if any.
Rules MakingOf(const char* name, std::vector<const char*> above = {}) {
    const std::string path = "{dir}/" + std::string(name);
    const char* const mkdir = Kept(path + ", 0777)");
    const char* const open = Kept(path + ", O_RDONLY");
    const char* const lstat = Kept(path + ")");
    std::vector<const char*> with = above;
    with.push_back(name);
    const Outcome left = {.result = -1, .records = {kNotOpened}, .made = with};
    return {
        {.call = "mkdir",
         .with = mkdir,
         .errors = {EIO, ENOSPC, EACCES, EPERM, ENOENT, EROFS},
         .outcome = {.result = -1, .records = {kNotMade}, .error = kInjectedErrno, .made = above}},
        // It is removed again.
        {.call = "open",
         .with = open,
         .outcome =
             {.result = -1, .records = {kNotOpened}, .error = kInjectedErrno, .made = above}},
        {.call = "lstat", .with = lstat, .outcome = left},
    };
}

FaultCase Making(const char* name, int parent_first, const char* path) {
    return {.name = name,
            .run = [=](FaultWorld& w) { return MAVOEAMKDir(parent_first, (w / path).c_str()); }};
}

const Rules kNoMemoryForPath = {
    {.call = "malloc", .outcome = {.result = -1, .records = {kNoMemory}}}};

// What the platform says of the new directory decides nothing.
const Rules kPlatformIgnored = {
    {.call = "MAVOGetFSType", .outcome = {.files = Files::kDone}},
    {.call = "MAVOACLSetEADirACL", .outcome = {.files = Files::kDone}},
};

TEST(MakeDirectoryFaults, ADirectoryIsMadeOrTheFailureIsRecorded) {
    FaultCase c = Making("mkdir", 0, "@eaDir");
    const Outcome left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir"}};
    c.rules = kNoMemoryForPath + MakingOf("@eaDir") + kPlatformIgnored +
              Rules{{.call = "mkdir", .errors = {EEXIST}},  // somebody else's: it is theirs to open
                    {.call = "fchmod", .outcome = left},
                    {.call = "fstat", .outcome = left}};
    SweepFaults(c);
}

TEST(MakeDirectoryFaults, ADirectoryThatExistsNeedsNothingElse) {
    FaultCase c = Making("mkdir, there", 0, "@eaDir");
    c.prepare = [](FaultWorld& w) { ASSERT_EQ(0, ::mkdir((w / "@eaDir").c_str(), 0700)); };
    c.rules = kNoMemoryForPath +
              Rules{{.call = "mkdir", .errors = {EEXIST}},
                    {.call = "mkdir", .outcome = {.result = -1, .records = {kNotMade}}}};
    SweepFaults(c);
}

TEST(MakeDirectoryFaults, AFolderInItIsNotTriedWhenTheParentFails) {
    FaultCase c = Making("mkdir, parent first", 1, "@eaDir/a");
    c.check = [](FaultWorld&, const FaultRun& run) {
        if (run.call.starts_with("mkdir({dir}/@eaDir,") && run.error != EEXIST) {
            EXPECT_EQ(0, run.CountAfter("mkdir("));
        }
    };
    // Of the calls that name no directory, the first of each kind is about the parent.
    const Outcome parent_left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir"}};
    const Outcome left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir", "@eaDir/a"}};
    c.rules = kNoMemoryForPath + MakingOf("@eaDir") + MakingOf("@eaDir/a", {"@eaDir"}) +
              kPlatformIgnored +
              Rules{
                  {.call = "mkdir",
                   .with = "@eaDir/a,",
                   .errors = {EEXIST},
                   .outcome = {.made = {"@eaDir"}}},
                  // It is said to exist, and does not: there is no place for the folder.
                  {.call = "mkdir",
                   .errors = {EEXIST},
                   .outcome = {.result = -1, .records = {kNotMade}, .error = ENOENT}},
                  {.call = "fchmod", .ordinal = 1, .outcome = parent_left},
                  {.call = "fchmod", .outcome = left},
                  {.call = "fstat", .ordinal = 1, .outcome = parent_left},
                  {.call = "fstat", .outcome = left},
              };
    SweepFaults(c);
}

// An attribute volume keeps the Finder info of the EA directory in w.text.
void BeAttributeVolume(FaultWorld& w) {
    Platform().fs_type = [](const std::string&, int) { return 7; };
    Hooks().setxattr = [&w](const char*, const char* name, const void* value, size_t size, int) {
        w.text = name + std::string("=") + std::string(static_cast<const char*>(value), size);
        return 0;
    };
}

TEST(MakeDirectoryFaults, TheInvisibleFinderInfoIsSetOrTheFailureIsRecorded) {
    FaultCase c = Making("mkdir, attribute volume", 0, "@eaDir");
    c.prepare = BeAttributeVolume;
    c.state = [](FaultWorld& w) { return w.text; };
    const Outcome left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir"}};
    Outcome hidden_and_left = left;
    hidden_and_left.torn = {"(state)"};
    c.rules = kNoMemoryForPath +
              Rules{{.call = "lstat", .ordinal = 2, .outcome = hidden_and_left}} +
              MakingOf("@eaDir") +
              Rules{{.call = "mkdir", .errors = {EEXIST}},
                    {.call = "fchmod", .outcome = left},
                    {.call = "fstat", .ordinal = 1, .outcome = left},
                    {.call = "fstat", .outcome = hidden_and_left},
                    {.call = "setxattr", .with = "com.apple.FinderInfo, 32, 0", .outcome = left},
                    // A volume of no known type has no Finder info.
                    {.call = "MAVOGetFSType", .outcome = {.made = {"@eaDir"}}},
                    {.call = "MAVOACLSetEADirACL", .outcome = {.files = Files::kDone}}};
    SweepFaults(c);
}

TEST(MakeDirectoryFaults, TheEffectiveUidComesBackWhateverFails) {
    FaultCase c = Making("mkdir, as a user", 0, "@eaDir");
    c.prepare = [](FaultWorld& w) {
        w.number = 1000;
        Hooks().geteuid = [&w] { return static_cast<uid_t>(w.number); };
        Hooks().seteuid = [&w](uid_t uid) {
            w.number = static_cast<int>(uid);
            return 0;
        };
    };
    c.state = [](FaultWorld& w) { return std::to_string(w.number); };
    const Outcome left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir"}};
    c.rules = kNoMemoryForPath + MakingOf("@eaDir") + kPlatformIgnored +
              Rules{{.call = "seteuid",
                     .with = "(0)",
                     .outcome = {.result = -1, .records = {kNotMade}, .error = kInjectedErrno}},
                    // Nothing can be done about that.
                    {.call = "seteuid",
                     .with = "(1000)",
                     .outcome = {.files = Files::kDone, .torn = {"(state)"}}},
                    {.call = "mkdir", .errors = {EEXIST}},
                    {.call = "fchmod", .outcome = left},
                    {.call = "fstat", .outcome = left}};
    SweepFaults(c);
}

// ---- Opening ----

constexpr char kStream[] = "@eaDir/a@MavoEAStream";
constexpr char kBeside[] = "._a";

FaultCase Opening(const char* name, int form, const char* kind, int flags, int place) {
    return {.name = name,
            .run =
                [=](FaultWorld& w) {
                    w.fd = MAVOEAOpen(form, (w / "a").c_str(), kind, flags, place);
                    return w.fd < 0 ? -1 : 0;
                },
            .finish =
                [](FaultWorld& w) {
                    if (w.fd >= 0) ::close(w.fd);
                }};
}

// Nothing is recorded of an open: its errno tells.
const Outcome kErrnoTells = {.result = -1, .error = kInjectedErrno};

TEST(OpenFaults, AFileBesideIsLookedForTwiceOnlyWhenItIsMissing) {
    FaultCase c = Opening("open beside", 1, "MavoEAStream", O_RDWR | O_CREAT, 1);
    c.prepare = [](FaultWorld& w) { WriteFile(w / kBeside, Ascii("AppleDouble")); };
    c.rules = {{.call = "open", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
               {.call = "open", .with = "{dir}/._a, O_RDWR", .outcome = kErrnoTells}};
    SweepFaults(c);
}

TEST(OpenFaults, AFileBesideThatCannotBeMadeIsNotLeft) {
    FaultCase c = Opening("create beside", 1, "MavoEAStream", O_RDWR | O_CREAT, 1);
    c.rules = {
        {.call = "open", .ordinal = 1, .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
        {.call = "open", .with = "{dir}/._a, O_RDWR", .outcome = kErrnoTells}};
    SweepFaults(c);
}

TEST(OpenFaults, AStreamThatIsThereIsOpenedOrErrnoTells) {
    FaultCase c = Opening("open stream", 1, "MavoEAStream", O_RDWR, 0);
    c.prepare = [](FaultWorld& w) {
        WriteFile(w / "a", Ascii("data"));
        ASSERT_EQ(0, ::mkdir((w / "@eaDir").c_str(), 0755));
        WriteFile(w / kStream, Ascii("stream"));
    };
    // When it is said to be missing, it is looked for in older layouts and then once more.
    c.rules = {{.call = "open",
                .with = "@MavoEAStream, O_RDWR",
                .ordinal = 1,
                .errors = {ENOENT},
                .outcome = {.files = Files::kDone}},
               {.call = "open", .with = "@MavoEAStream, O_RDWR", .outcome = kErrnoTells}};
    SweepFaults(c);
}

TEST(OpenFaults, AStreamThatIsMissingIsReportedMissing) {
    FaultCase c = Opening("open missing stream", 1, "MavoEAStream", O_RDWR, 0);
    c.prepare = [](FaultWorld& w) {
        WriteFile(w / "a", Ascii("data"));
        ASSERT_EQ(0, ::mkdir((w / "@eaDir").c_str(), 0755));
    };
    c.clean = {.result = -1, .any_log = true, .any_records = true};
    Outcome missing = c.clean;
    missing.error = ENOENT;
    c.rules = {
        {.call = "open",
         .with = "@MavoEAStream, O_RDWR",
         .ordinal = 1,
         .errors = {ENOENT},
         .outcome = missing},
        {.call = "open", .with = "@MavoEAStream, O_RDWR", .ordinal = 1, .outcome = kErrnoTells},
        // The search in older layouts, whose failure is of no account.
        {.call = "", .outcome = {.result = -1, .any_log = true, .any_records = true}}};
    SweepFaults(c);
}

TEST(OpenFaults, AStreamIsMadeWithItsDirectoryOrErrnoTells) {
    FaultCase c = Opening("create stream", 1, "MavoEAStream", O_RDWR | O_CREAT, 0);
    c.prepare = [](FaultWorld& w) { WriteFile(w / "a", Ascii("data")); };
    c.clean = {.any_log = true, .any_records = true};
    const Outcome left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir"}};
    const Outcome not_opened = {.result = -1, .error = kInjectedErrno, .made = {"@eaDir"}};
    const Outcome unseen = {.result = -1,
                            .records = {{0x900, "ea_upgrade"}},
                            .error = kInjectedErrno,
                            .made = {"@eaDir"}};
    c.rules =
        Rules{{.call = "malloc", .ordinal = 1, .outcome = {.result = -1, .records = {kNoMemory}}}} +
        MakingOf("@eaDir") +
        Rules{
            {.call = "mkdir",  // said to exist, although nothing can be made in it
             .errors = {EEXIST},
             .outcome = {.result = -1, .error = ENOENT, .any_log = true, .any_records = true}},
            {.call = "fchmod", .ordinal = 1, .outcome = left},
            {.call = "fstat", .ordinal = 1, .outcome = left},
            {.call = "open",
             .with = "@MavoEAStream, O_RDWR|O_CREAT",
             .outcome = {.result = -1,
                         .error = kInjectedErrno,
                         .made = {"@eaDir"},
                         .any_log = true,
                         .any_records = true}},
            {.call = "open",
             .with = "@MavoEAStream, O_RDWR",
             .ordinal = 1,
             .errors = {EIO, EACCES, EPERM, EMFILE, EINTR, ENOMEM, EROFS, ENOSPC},
             .outcome = not_opened},
            // The search in older layouts, which must not miss what a new file would hide.
            {.call = "opendir", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
            {.call = "opendir", .outcome = unseen},
            {.call = "lstat",
             .with = "{dir}/._a)",
             .errors = {ENOENT},
             .outcome = {.files = Files::kDone}},
            {.call = "lstat", .with = "{dir}/._a)", .outcome = unseen},
            // What the platform says.
            {.call = "", .outcome = {.files = Files::kDone, .any_log = true, .any_records = true}}};
    SweepFaults(c);
}

TEST(OpenFaults, AFileOfALegacyFolderIsMadeWithBothDirectories) {
    FaultCase c = Opening("create legacy file", 0, "MAVO:Resource", O_RDWR | O_CREAT, 0);
    c.prepare = [](FaultWorld& w) { WriteFile(w / "a", Ascii("data")); };
    const Outcome parent_left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir"}};
    const Outcome left = {.result = -1, .records = {kNotOpened}, .made = {"@eaDir", "@eaDir/a"}};
    c.rules =
        kNoMemoryForPath + MakingOf("@eaDir") + MakingOf("@eaDir/a", {"@eaDir"}) +
        kPlatformIgnored +
        Rules{
            {.call = "mkdir",
             .with = "@eaDir/a,",
             .errors = {EEXIST},
             .outcome = {.result = -1, .error = ENOENT, .made = {"@eaDir"}}},
            {.call = "mkdir",
             .errors = {EEXIST},
             .outcome = {.result = -1, .records = {kNotMade}, .error = ENOENT}},
            {.call = "fchmod", .ordinal = 1, .outcome = parent_left},
            {.call = "fchmod", .outcome = left},
            {.call = "fstat", .ordinal = 1, .outcome = parent_left},
            {.call = "fstat", .outcome = left},
            {.call = "open",
             .with = "MAVO:Resource, O_RDWR|O_CREAT",
             .outcome = {.result = -1, .error = kInjectedErrno, .made = {"@eaDir", "@eaDir/a"}}},
        };
    SweepFaults(c);
}

// ---- Names and marks ----

FaultCase NameTest(const char* name, int (*test)(const char*), Outcome clean, int failure) {
    return {.name = name,
            .run = [test](FaultWorld&) { return test("/v/@eaDir/"); },
            .clean = clean,
            .rules = {{.call = "malloc",
                       .outcome = {.result = failure, .records = {{0x200, "ea_is_hidden_dir"}}}}}};
}

TEST(NameFaults, WithoutMemoryForItsCopyAPathIsNoHiddenDirectory) {
    SweepFaults(NameTest("hidden directory", MAVOEAIsHiddenDir, {.result = 1}, -1));
    SweepFaults(NameTest("veto file", MAVOEAIsVetoFile, {.result = 1}, 0));
    SweepFaults(NameTest("hidden file", MAVOEAIsHiddenFile, {.result = 1}, 0));
}

TEST(NameFaults, HiddenNamesPushedBeforeAFailureStay) {
    FaultCase c = {
        .name = "hidden directory names",
        .prepare = [](FaultWorld& w) { w.list = NewList({"before"}); },
        .run = [](FaultWorld& w) { return MAVOEAHiddenDirGet(&w.list); },
        .finish = [](FaultWorld& w) { MLIBCSzListFree(w.list); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                std::vector<std::string> names = {"before", "@eaDir", "@tmp", "@sharebin"};
                if (!run.call.empty()) names.resize(1 + run.failed_at);
                EXPECT_EQ(names, Strings(w.list));
            },
        .rules = {{.call = "MLIBCSzListPush", .outcome = {.result = -1}}}};
    SweepFaults(c);
}

TEST(NameFaults, TheIndexsRefusalIsTheResult) {
    SweepFaults({.name = "index",
                 .run = [](FaultWorld& w) { return MAVOIndex((w / "a").c_str(), nullptr, 7); },
                 .rules = {{.call = "MLIBMavoIndexAddEx", .outcome = {.result = -1}}}});
}

TEST(NameFaults, TheArchiveBitIsSetOrErrnoTells) {
    SweepFaults({.name = "archive bit",
                 .prepare =
                     [](FaultWorld& w) {
                         WriteFile(w / "a", Ascii("data"));
                         Hooks().archive = [&w](int) {
                             w.text = "archive";
                             return 0;
                         };
                     },
                 .run = [](FaultWorld& w) { return EASetSmbArchive((w / "a").c_str()); },
                 .state = [](FaultWorld& w) { return w.text; },
                 .rules = {{.call = "open", .outcome = kErrnoTells},
                           {.call = "archive", .outcome = kErrnoTells}}});
}

}  // namespace
}  // namespace mavoea::test

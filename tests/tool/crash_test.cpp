// What a crash costs of commands that are no renames and copies: which files they change in place,
// what they leave when they are killed, and what they have put on disk by when.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <utility>

#include "tests/support/second_volume.h"
#include "tests/tool/kills.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;
using ::testing::Contains;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::UnorderedElementsAre;

bool IsMetadata(const fs::path& path) {
    return path.filename().string().starts_with("._") ||
           path.string().find("/@eaDir/") != std::string::npos;
}

std::vector<std::string> MetadataFilesIn(const std::string& root) {
    std::vector<std::string> files;
    for (const auto& entry : fs::recursive_directory_iterator(root)) {
        if (entry.is_regular_file() && IsMetadata(entry.path())) files.push_back(entry.path());
    }
    return files;
}

using FileId = std::pair<dev_t, ino_t>;

std::optional<FileId> IdOf(const std::string& path) {
    struct stat info = {};
    if (stat(path.c_str(), &info) != 0) return std::nullopt;
    return FileId{info.st_dev, info.st_ino};
}

// ---- The objects --------------------------------------------------------------------------------

const Bytes kFinderInfo = Pattern(32, 0x40);

// What earlier versions kept: attribute files, and a resource file that says that the object is
// read-only; on file-EA volumes the record has what the latter says besides.
void PutLegacyAttributes(const std::string& object) {
    PutLegacy(object, "user.one", Pattern(9000, 1));
    PutLegacy(object, "user.two", Pattern(50, 2));
}
void PutLegacyResource(const std::string& object) {
    constexpr std::uint32_t kReadOnly = 0x0020;
    Bytes afp_info(4);
    PutU32(afp_info, 0, kReadOnly);
    PutLegacy(object, "MAVO:Resource",
              ResourceFileOf({{kFinderInfoEntry, kFinderInfo},
                              {kCommentEntry, Ascii("a comment")},
                              {kAfpInfoEntry, afp_info},
                              {kForkEntry, Ascii("fork")}}));
}

// A resource file that wrongly holds attributes, beside a stream that has others.
void PutWrongResource(const std::string& object) {
    PutStream(object, StreamImage{.attributes = {{"user.one", Pattern(9000, 1)}}}.Build());
    PutResource(object, StreamImage{.attributes = {{"user.two", Pattern(50, 2)}},
                                    .fork = Ascii("fork"),
                                    .finder_info = kFinderInfo}
                            .Build());
}

// ---- New files ----------------------------------------------------------------------------------

// Metadata files as they were: whoever writes into one is seen, for another file has its name.
class HeldFiles {
 public:
    explicit HeldFiles(const std::string& root) {
        for (const std::string& path : MetadataFilesIn(root)) {
            files_.push_back({path, open(path.c_str(), O_RDONLY | O_CLOEXEC), ReadFile(path)});
        }
    }
    ~HeldFiles() {
        for (const Held& file : files_) close(file.fd);
    }
    HeldFiles(const HeldFiles&) = delete;
    HeldFiles& operator=(const HeldFiles&) = delete;

    void ExpectUntouched() const {
        for (const Held& file : files_) {
            EXPECT_EQ(file.bytes, ReadFile("/proc/self/fd/" + std::to_string(file.fd)))
                << file.path;
        }
    }
    // How many have another file, or none, under their names.
    int Replaced() const {
        return static_cast<int>(std::count_if(files_.begin(), files_.end(), [](const Held& file) {
            return IdOf(file.path) != IdOf("/proc/self/fd/" + std::to_string(file.fd));
        }));
    }

 private:
    struct Held {
        std::string path;
        int fd;
        Bytes bytes;
    };
    std::vector<Held> files_;
};

struct Work {
    std::string command;
    int from;
    int to;
};
std::string NameOf(const Work& work) {
    return work.command + "From" + std::to_string(work.from) + "To" + std::to_string(work.to);
}
void PrintTo(const Work& work, std::ostream* out) { *out << NameOf(work); }

std::vector<Work> AllWorks() {
    std::vector<Work> works;
    for (const std::string command : {"cp", "mv", "convert"}) {
        for (const auto& [from, to] :
             {std::pair(kAppleDouble, kEaDirectory), std::pair(kEaDirectory, kAppleDouble),
              std::pair(kEaDirectory, kEaDirectory), std::pair(kAppleDouble, kFileEa)}) {
            works.push_back({command, from, to});
        }
    }
    for (const std::string command : {"upgrade", "repair"}) {
        for (const int type : {kEaDirectory, kFileEa}) works.push_back({command, type, type});
    }
    return works;
}

class NewFilesTest : public ::testing::TestWithParam<Work> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(travel_.dir().path());
        const std::string& command = GetParam().command;
        MakeDir(travel_.From("tree"));
        const std::string object = travel_.From("tree/object");
        WriteFile(object, Ascii("data"));
        if (command == "upgrade") {
            PutLegacyResource(object);
            PutStream(object, AppleDoubleOfColour("blue"));
            arguments_ = {command, object};
        } else if (command == "repair") {
            PutWrongResource(object);
            arguments_ = {command, object};
        } else {
            ASSERT_NO_FATAL_FAILURE(travel_.GiveMetadata(object, "blue"));
            MakeDir(travel_.To("tree"));
            const std::string there = travel_.To("tree/object");
            WriteFile(there, Ascii("data"));
            ASSERT_NO_FATAL_FAILURE(travel_.GiveMetadata(there, "red"));
            arguments_ = {command, "-f", object, there};
            // Its metadata is to be replaced, and is no part of the comparison.
            if (command == "convert") arguments_ = {command, "--to", Type(), object, there};
        }
    }
    static std::string Type() { return std::to_string(GetParam().to); }

    Travel travel_{GetParam().from, GetParam().to};
    Arguments arguments_;
};
INSTANTIATE_TEST_SUITE_P(Works, NewFilesTest, ::testing::ValuesIn(Thinned(AllWorks())),
                         [](const auto& tested) { return NameOf(tested.param); });

// Promise: "The tool: `cp`, `mv`, `convert`, `upgrade` and `repair` of the tool"
// Promise: "The tool: They make each file"
TEST_P(NewFilesTest, NoMetadataFileIsChangedInPlace) {
    const HeldFiles held(travel_.dir().path());
    EXPECT_THAT(travel_.Run(arguments_), Succeeded());
    held.ExpectUntouched();
    EXPECT_LT(0, held.Replaced());
}

// Promise: "The tool: `cp`, `mv`, `convert`, `upgrade` and `repair` of the tool"
TEST_P(NewFilesTest, NoOtherProgramIsRun) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    std::vector<std::string> programs;
    const StoppedRun run = RunStopped(travel_.WithVolumes(arguments_), travel_.dir().path(),
                                      [&](const FileCall& call) {
                                          if (call.name.starts_with("exec")) {
                                              programs.push_back(::testing::PrintToString(call));
                                          }
                                          return true;
                                      });
    EXPECT_EQ(0, run.status) << run.err;
    EXPECT_THAT(programs, IsEmpty());
}

// What the tool asks of the library is nothing that takes several files.
// Promise: "The tool: `cp`, `mv`, `convert`, `upgrade` and `repair` of the tool"
TEST(OperationsTest, OfTheLibraryAreNotCalledByTheTool) {
    // The tool has the library within itself: what its own units ask for is in those.
    const std::string units = fs::path(Tested().path).parent_path() / "../tools/units.txt";
    if (!fs::exists(units)) GTEST_SKIP() << "it lies where it was not built";
    const ProgramResult symbols =
        RunProgram("xargs -d '\\n' -a " + Quoted(units) + " readelf -sW 2>/dev/null");
    if (symbols.status != 0) GTEST_SKIP() << "there is no readelf";
    ASSERT_THAT(symbols.output, ::testing::HasSubstr(" UND MAVOEASWrite\n"));
    for (const std::string operation :
         {"MAVOEACopy", "MAVOEACopyEx", "MAVOEAUpgrade", "MAVOEARename", "MAVOEARemove",
          "MAVOEARemoveWithoutEAStream", "MAVOEARemoveDanglingEADir", "MAVOEAFixErrorAD"}) {
        EXPECT_THAT(symbols.output, Not(::testing::HasSubstr(" UND " + operation + '\n')));
    }
}

// ---- Files that are changed in place ------------------------------------------------------------

// Three attributes and, behind them, a fork.
class InPlaceTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
        MAVOEA_SKIP_UNLESS_STOPPED();
    }

    static Bytes Value(std::size_t size) { return Repeat('x', size); }

    void Make(std::size_t fork_size) const {
        fs::remove_all(root_);
        MakeDir(root_);
        WriteFile(Object(), Ascii("data"));
        PutStream(Object(), StreamImage{.attributes = {{"user.a", Pattern(300, 1)},
                                                       {Colour(), Pattern(300, 2)},
                                                       {"user.c", Pattern(300, 3)}},
                                        .fork = Pattern(fork_size, 4)}
                                .Build());
    }
    std::string Object() const { return root_ + "/object"; }

    // What is there of them, when this value or none is set.
    std::string State(const std::optional<Bytes>& new_value, std::size_t fork_size) const {
        const Holdings found = HoldingsOf(kEaDirectory, Object());
        const auto has = [&](const std::string& name, const Bytes& value) {
            return found.HasAttribute({name, value});
        };
        const bool done =
            new_value ? has(Colour(), *new_value) : !found.attributes.contains(Colour());
        std::string state = has(Colour(), Pattern(300, 2)) ? "old"
                            : done                         ? "new"
                                                           : "LOST the value";
        if (!has("user.a", Pattern(300, 1))) state += ", LOST user.a";
        if (!has("user.c", Pattern(300, 3))) state += ", LOST user.c";
        if (fork_size > 0 && !found.HasFork(Pattern(fork_size, 4))) state += ", LOST fork";
        return state;
    }

    // All that kills of the command leave, in the file that was there.
    std::set<std::string> StatesOf(Arguments arguments, std::size_t fork_size,
                                   const std::function<std::string()>& state) const {
        arguments.insert(arguments.begin(), {"--volume", root_ + "=1"});
        std::set<std::string> states;
        std::optional<FileId> before;
        KillAtEachChange(
            arguments, root_,
            [&] {
                Make(fork_size);
                before = IdOf(MetadataPaths(Object()).stream);
            },
            [&] {
                states.insert(state());
                EXPECT_EQ(before, IdOf(MetadataPaths(Object()).stream));
            });
        return states;
    }
    std::set<std::string> StatesOfSet(std::size_t size, std::size_t fork_size) const {
        return StatesOf({"set", Object(), Colour(), std::string(size, 'x')}, fork_size,
                        [=, this] { return State(Value(size), fork_size); });
    }
    std::set<std::string> StatesOfRemove(std::size_t fork_size) const {
        return StatesOf({"remove", Object(), Colour()}, fork_size,
                        [=, this] { return State(std::nullopt, fork_size); });
    }

    const TempDir dir_{FastDirectory()};
    const std::string root_ = dir_ / "volume";
};

// As of the library's writes.
// Promise: "The tool: `set`, `remove`, `lock`, `import`"
TEST_F(InPlaceTest, WhatAKillLeavesIsWhatTheLibrarysWriteLeaves) {
    constexpr std::size_t kFork = 40000;
    for (const std::size_t size : {100u, 300u, 500u}) {
        EXPECT_THAT(StatesOfSet(size, 0), UnorderedElementsAre("old", "new")) << size;
    }
    EXPECT_THAT(StatesOfRemove(0), UnorderedElementsAre("old", "new"));
    EXPECT_THAT(StatesOfSet(100, kFork), UnorderedElementsAre("old", "new, LOST fork", "new"));
    EXPECT_THAT(StatesOfSet(300, kFork), UnorderedElementsAre("old", "new"));
    EXPECT_THAT(StatesOfSet(500, kFork), UnorderedElementsAre("old", "old, LOST fork", "new"));
    EXPECT_THAT(StatesOfRemove(kFork),
                UnorderedElementsAre("old", "LOST the value, LOST user.c, LOST fork", "new"));
    EXPECT_THAT(StatesOf({"lock", Object()}, kFork,
                         [&] {
                             const bool locked = (MarksOf(Object()) & kLockedMark) != 0;
                             return State(std::nullopt, kFork) + (locked ? ", locked" : "");
                         }),
                UnorderedElementsAre("old", "old, locked"));
}

// An AppleSingle file with that data.
Bytes SingleOf(const Bytes& data) {
    Bytes file = AppleDoubleOf({{1, data}, {kFinderInfoEntry, kFinderInfo}});
    PutU32(file, 0, 0x00051600);
    return file;
}

// What there is of the old data and of the new, which differ everywhere.
std::string MixtureOf(const Bytes& found, const Bytes& old_data, const Bytes& new_data) {
    if (found == old_data) return "old";
    if (found == new_data) return "new";
    std::size_t end = 0;
    while (end < found.size() && end < new_data.size() && found[end] == new_data[end]) ++end;
    for (std::size_t at = end; at < found.size(); ++at) {
        // Where nothing has been written yet there may be room.
        const std::uint8_t wanted = at < old_data.size() ? old_data[at] : 0;
        if (found[at] != wanted) return "DAMAGED";
    }
    return end == 0 ? "old, and room" : "mixed";
}

// Promise: "The tool: `import --data` over a file |"
TEST_F(InPlaceTest, AnImportOfDataThatWasKilledLeavesAMixtureUntilItHasRunAgain) {
    const std::string source = dir_ / "source";
    const Bytes old_data = Repeat('o', 3000000);
    for (const std::size_t size : {2900000u, 3100000u}) {
        SCOPED_TRACE(size);
        const Bytes new_data = Repeat('n', size);
        WriteFile(source, SingleOf(new_data));
        const Arguments arguments = {"--volume", root_ + "=1", "import",
                                     "--data",   source,       Object()};
        std::set<std::string> states;
        KillAtEachChange(
            arguments, root_,
            [&] {
                Make(0);
                WriteFile(Object(), old_data);
            },
            [&] {
                states.insert(MixtureOf(ReadFile(Object()), old_data, new_data));
                EXPECT_EQ(SingleOf(new_data), ReadFile(source));
                EXPECT_THAT(RunTool(arguments), Succeeded());
                EXPECT_EQ(new_data, ReadFile(Object()));
                EXPECT_TRUE(HoldingsOf(kEaDirectory, Object()).HasFinderInfo(kFinderInfo));
            });
        EXPECT_THAT(states, Contains("mixed"));
        EXPECT_THAT(states, Contains("new"));
        EXPECT_THAT(states, Not(Contains("DAMAGED")));
    }
}

// Promise: "The tool: `import --data` syncs the data"
TEST_F(InPlaceTest, DataIsOnDiskBeforeAnImportOfItEnds) {
    const std::string source = dir_ / "source";
    WriteFile(source, SingleOf(Ascii("the new data")));
    Make(0);
    bool synced = false;
    const StoppedRun run = RunStopped(
        {"--volume", root_ + "=1", "import", "--data", source, Object()}, root_,
        [&](const FileCall& call) {
            const bool of_object = call.open_file == Object();
            if (of_object && call.Changes()) synced = false;
            if (of_object && call.Syncs()) synced = true;
            return true;
        },
        Stops::kAtSyncsToo);
    EXPECT_EQ(0, run.status) << run.err;
    EXPECT_TRUE(synced);
}

// A file that is made has all of its data or no name.
TEST_F(InPlaceTest, AnImportOfANewFileThatWasKilledHasMadeAllOfItOrNothing) {
    const std::string source = dir_ / "source";
    const std::string made = root_ + "/made";
    const Bytes data = Repeat('n', 600000);
    WriteFile(source, SingleOf(data));
    const Arguments arguments = {"--volume", root_ + "=1", "import", source, made};
    KillAtEachChange(
        arguments, root_, [&] { Make(0); },
        [&] {
            if (Exists(made)) {
                EXPECT_EQ(data, ReadFile(made));
            }
            EXPECT_THAT(RunTool(arguments), Succeeded());
            EXPECT_EQ(data, ReadFile(made));
            EXPECT_TRUE(HoldingsOf(kEaDirectory, made).HasFinderInfo(kFinderInfo));
        });
}

// The file gets its name when it is whole, in each format; what it is made of stays as it is.
TEST_F(InPlaceTest, AnExportThatWasKilledHasMadeAllOfTheFileOrLeftTheOldOne) {
    const auto make = [this] {
        Make(3000);
        fs::last_write_time(Object(), fs::file_time_type{});  // which is in some of them
    };
    for (const std::string format : {"appledouble", "applesingle", "macbinary", "binhex"}) {
        SCOPED_TRACE(format);
        const std::string target = root_ + "/exported";
        const Arguments arguments = {"--volume", root_ + "=1", "export", "--force",
                                     "--format", format,       Object(), target};
        make();
        (void)RunTool(arguments);
        const Bytes whole = ReadFile(target);
        const Bytes stream = ReadFile(MetadataPaths(Object()).stream);
        int nth = 1;
        for (bool killed = true; killed && !HasFailure(); ++nth) {
            SCOPED_TRACE(nth);
            make();
            WriteFile(target, Ascii("the old one"));
            killed = RunKilledAt(arguments, root_, nth).status == 128 + SIGKILL;
            EXPECT_THAT((std::set<Bytes>{whole, Ascii("the old one")}), Contains(ReadFile(target)));
            EXPECT_EQ(stream, ReadFile(MetadataPaths(Object()).stream));
            EXPECT_EQ(Ascii("data"), ReadFile(Object()));
            (void)RunTool(arguments);
            EXPECT_EQ(whole, ReadFile(target));
        }
        EXPECT_LT(2, nth);
    }
}

// Promise: "The tool: `set`, `remove`, `lock`, `import`"
TEST_F(InPlaceTest, AnImportThatWasKilledIsBroughtToItsEndByAnother) {
    const std::string source = dir_ / "source";
    WriteFile(source, StreamImage{.attributes = {{Colour(), Value(100)}, {"user.d", Value(200)}},
                                  .finder_info = kFinderInfo}
                          .Build());
    std::optional<FileId> before;
    const Arguments arguments = {"--volume", root_ + "=1", "import", source, Object()};
    KillAtEachChange(
        arguments, root_,
        [&] {
            Make(0);
            before = IdOf(MetadataPaths(Object()).stream);
        },
        [&] {
            EXPECT_THAT((std::set<std::string>{"old", "new"}), Contains(State(Value(100), 0)));
            EXPECT_EQ(before, IdOf(MetadataPaths(Object()).stream));
            EXPECT_THAT(RunTool(arguments), Succeeded());
            EXPECT_EQ("new", State(Value(100), 0));
            const Holdings found = HoldingsOf(kEaDirectory, Object());
            EXPECT_TRUE(found.HasAttribute({"user.d", Value(200)}));
            EXPECT_TRUE(found.HasFinderInfo(kFinderInfo));
        });
}

// ---- What is on disk ----------------------------------------------------------------------------

// What has been written and not been synced: contents, attributes and rights of files, and the
// names that they got.
class Unsynced {
 public:
    // The call is about to be made.
    void Note(const FileCall& call) {
        const auto file = call.descriptor.empty() ? std::nullopt : IdOf(call.descriptor);
        if (call.name == "syncfs" && file) {
            const auto on_volume = [&](const auto& one) { return one.first.first == file->first; };
            std::erase_if(contents_, on_volume);
            std::erase_if(names_, on_volume);
        } else if (call.Syncs() && file) {
            contents_.erase(*file);
            names_.erase(*file);
        } else if (call.name.starts_with("link") || call.name.starts_with("rename")) {
            for (const auto& look_up : call.look_ups) {
                const auto directory = IdOf(fs::path(look_up.path).parent_path());
                if (directory) names_[*directory] = look_up.path;
            }
        } else if (file && call.Changes() && fs::is_regular_file(call.descriptor)) {
            contents_[*file] = call.open_file;
        }
    }

    // All but the file of that path, if there is one.
    std::vector<std::string> But(const std::string& path) const {
        std::vector<std::string> all;
        for (const auto& [file, name] : contents_) {
            if (file != IdOf(path)) all.push_back("contents of " + name);
        }
        for (const auto& [file, name] : names_) all.push_back("name of " + name);
        return all;
    }

 private:
    std::map<FileId, std::string> contents_;
    std::map<FileId, std::string> names_;  // by their directory
};

class SyncTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume_.path());
        MAVOEA_SKIP_UNLESS_STOPPED();
    }

    // Notes what is not synced yet before each call, and at the end.
    void Run(Arguments arguments, const std::function<void(const FileCall&)>& at_call = {}) {
        unsynced_ = {};
        int noted = 0;
        arguments.insert(arguments.begin(),
                         {"--volume", volume_.path() + '=' + std::to_string(GetParam())});
        const StoppedRun run = RunStopped(
            arguments, volume_.path(),
            [&](const FileCall& call) {
                if (at_call) at_call(call);
                unsynced_.Note(call);
                noted += call.Syncs() ? 1 : 0;
                return true;
            },
            Stops::kAtSyncsToo);
        EXPECT_EQ(0, run.status) << run.err;
        EXPECT_LT(0, noted);
    }
    void ExpectFilesOnDisk() const { EXPECT_THAT(unsynced_.But(volume_.object()), IsEmpty()); }

    Volume volume_{GetParam(), FastDirectory()};
    Unsynced unsynced_;
};
INSTANTIATE_TEST_SUITE_P(EveryKind, SyncTest,
                         ::testing::ValuesIn(Types({kAppleDouble, kEaDirectory, kFileEa})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

// Promise: "The tool: `set`, `upgrade`, `repair` and `import` sync"
TEST_P(SyncTest, WhatIsSetOrImportedIsInFilesThatAreOnDiskAndSoAreTheirNames) {
    const std::string object = volume_.object();
    for (const std::string& name :
         {Colour(), std::string(kFinderInfoName), std::string(kForkName)}) {
        for (const char digit : {'1', '2'}) {  // in a file that is made, and in one that is there
            SCOPED_TRACE(name + ", " + digit);
            const std::string value(32, digit);
            Run({"set", object, name, value});
            ExpectFilesOnDisk();
            EXPECT_EQ(value, volume_.Run({"get", object, name}).out);
        }
    }
    ASSERT_THAT(volume_.Run({"rm", object}), Succeeded());
    WriteFile(object, Ascii("data"));
    const TempDir sources;
    WriteFile(sources / "source", NetatalkFile(kFinderInfo, Ascii("fork")).bytes);
    Run({"import", sources / "source", object});
    ExpectFilesOnDisk();
    EXPECT_EQ("fork", volume_.Run({"get", object, kForkName}).out);
}

// Promise: "The tool: Attributes of the object"
TEST(AttributeSyncTest, WhatIsSetOfTheObjectItselfIsLeftToOthers) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    const Volume volume(kXattr);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    bool changed = false;
    const StoppedRun run = RunStopped(
        {"--volume", volume.path() + "=7", "set", volume.object(), Colour(), "blue"}, volume.path(),
        [&](const FileCall& call) {
            EXPECT_FALSE(call.Syncs()) << ::testing::PrintToString(call);
            changed = changed || (call.Changes() && IdOf(call.descriptor) == IdOf(volume.object()));
            return true;
        },
        Stops::kAtSyncsToo);
    EXPECT_THAT(run, Succeeded());
    EXPECT_TRUE(changed);
}

// ---- Upgrades and repairs
// -----------------------------------------------------------------------------------

class EaDirectoryTest : public SyncTest {
 protected:
    void MakeLegacy() const {
        MakeEmpty();
        PutLegacyAttributes(volume_.object());
        PutLegacyResource(volume_.object());
    }
    void MakeAppleDouble() const {
        MakeEmpty();
        StreamImage image = {
            .attributes = {{"user.one", Pattern(9000, 1)}, {"user.two", Pattern(50, 2)}},
            .fork = Ascii("fork"),
            .finder_info = kFinderInfo};
        PutAppleDouble(volume_.object(), image.Build());
    }

    // All of it, wherever services look for it; of earlier layouts only what has no newer one.
    void ExpectAllThere() const {
        const Holdings found = HoldingsOf(GetParam(), volume_.object());
        EXPECT_TRUE(found.HasAttribute({"user.one", Pattern(9000, 1)}));
        EXPECT_TRUE(found.HasAttribute({"user.two", Pattern(50, 2)}));
        EXPECT_TRUE(found.HasFinderInfo(kFinderInfo));
        EXPECT_TRUE(found.HasFork(Ascii("fork")));
    }

    bool IsEarlier(const std::string& path) const {
        const MetadataPaths paths(volume_.object());
        return path == paths.apple_double || path.starts_with(paths.folder + '/');
    }

 private:
    void MakeEmpty() const {
        for (const std::string& name : NamesIn(volume_.path())) {
            fs::remove_all(volume_.path() + '/' + name);
        }
        WriteFile(volume_.object(), Ascii("data"));
    }
};
INSTANTIATE_TEST_SUITE_P(EveryKind, EaDirectoryTest,
                         ::testing::ValuesIn(Types({kEaDirectory, kFileEa})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

// Promise: "The tool: `upgrade` |"
TEST_P(EaDirectoryTest, KillsLoseNothingAndPutNothingOutOfSight) {
    const Arguments arguments = {"--volume", volume_.path() + '=' + std::to_string(GetParam()),
                                 "upgrade", volume_.object()};
    for (const bool legacy : {true, false}) {
        KillAtEachChange(
            arguments, volume_.path(), [&] { legacy ? MakeLegacy() : MakeAppleDouble(); },
            [&] {
                ExpectAllThere();
                // The mark comes before the last file that tells of it goes.
                if (legacy && !Exists(MetadataPaths(volume_.object()).folder + "/MAVO:Resource")) {
                    EXPECT_FALSE(HoldingsOf(GetParam(), volume_.object()).writable);
                }
                EXPECT_EQ(0, RunTool(arguments).status);
                ExpectAllThere();
            });
    }
}

// Promise: "The tool: `upgrade` |"
// Promise: "The tool: `set`, `upgrade`, `repair` and `import` sync"
// Promise: "The tool: Attributes of the object"
TEST_P(EaDirectoryTest, NothingGoesBeforeWhatItHasBecomeIsOnDisk) {
    for (const bool legacy : {true, false}) {
        legacy ? MakeLegacy() : MakeAppleDouble();
        int removed = 0;
        Run({"upgrade", volume_.object()}, [&](const FileCall& call) {
            if (!call.name.starts_with("unlink") || !IsEarlier(call.look_ups.at(0).path)) return;
            ++removed;
            // A record and a read-only mark are with the object.
            const bool with_object = legacy || GetParam() == kFileEa;
            EXPECT_THAT(unsynced_.But(with_object ? "" : volume_.object()), IsEmpty());
        });
        EXPECT_EQ(legacy ? 3 : 1, removed);
        ExpectFilesOnDisk();
        ExpectAllThere();
    }
}

// Promise: "The tool: `set`, `upgrade`, `repair` and `import` sync"
TEST_P(EaDirectoryTest, WhatIsRepairedIsOnDisk) {
    PutWrongResource(volume_.object());
    Run({"repair", volume_.object()});
    ExpectFilesOnDisk();
    const Holdings found = HoldingsOf(GetParam(), volume_.object());
    EXPECT_TRUE(found.HasAttribute({"user.one", Pattern(9000, 1)}));
    EXPECT_TRUE(found.HasAttribute({"user.two", Pattern(50, 2)}));
}

// ---- Copies -------------------------------------------------------------------------------------

class VolumeSyncTest : public ::testing::TestWithParam<std::string> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_UNLESS_STOPPED();
        MAVOEA_SKIP_WITHOUT_SECOND(second_);
        travel_.emplace(kAppleDouble, kEaDirectory, second_.path());
        for (const std::string name : {"tree/a", "tree/inner/b"}) {
            fs::create_directories(fs::path(travel_->From(name)).parent_path());
            travel_->MakeFile(travel_->From(name));
            ASSERT_NO_FATAL_FAILURE(travel_->GiveMetadata(travel_->From(name)));
        }
        if (GetParam() == "carry") {
            for (const std::string name : {"tree/a", "tree/inner/b"}) {
                fs::create_directories(fs::path(travel_->To(name)).parent_path());
                travel_->MakeFile(travel_->To(name));
            }
        }
        arguments_ = {GetParam()};
        if (GetParam() != "mv") arguments_.emplace_back("-r");
        if (GetParam() == "cp" || GetParam() == "mv") arguments_.emplace_back("-T");
        if (GetParam() == "convert") arguments_.insert(arguments_.end(), {"--to", "1"});
        arguments_.insert(arguments_.end(), {travel_->From("tree"), travel_->To("tree")});
    }

    bool ChangesTarget(const FileCall& call) const {
        const auto is_there = [this](const std::string& path) {
            return path.starts_with(travel_->target() + '/');
        };
        return call.Changes() &&
               (is_there(call.open_file) ||
                std::any_of(call.look_ups.begin(), call.look_ups.end(),
                            [&](const auto& look_up) { return is_there(look_up.path); }));
    }
    bool RemovesFromSource(const FileCall& call) const {
        return call.name.starts_with("unlink") &&
               call.look_ups.at(0).path.starts_with(travel_->source() + '/');
    }

    SecondVolume second_;
    std::optional<Travel> travel_;
    Arguments arguments_;
};
INSTANTIATE_TEST_SUITE_P(Commands, VolumeSyncTest,
                         ::testing::Values("cp", "mv", "convert", "carry"),
                         [](const auto& tested) { return tested.param; });

// Promise: "The tool: `cp`, `mv` between volumes, `convert` and `carry` sync"
TEST_P(VolumeSyncTest, AllIsOnDiskAtTheEndAndBeforeAnythingIsRemoved) {
    bool synced = false;
    int changes = 0;
    int removals = 0;
    const StoppedRun run = RunStopped(
        travel_->WithVolumes(arguments_), travel_->dir().path(),
        [&](const FileCall& call) {
            if (call.name == "syncfs") {
                synced = IdOf(call.descriptor)->first == IdOf(travel_->target())->first;
            } else if (RemovesFromSource(call)) {
                ++removals;
                EXPECT_TRUE(synced) << ::testing::PrintToString(call);
            } else if (ChangesTarget(call) && removals == 0) {
                ++changes;
                synced = false;
            }
            return true;
        },
        Stops::kAtSyncsToo);
    EXPECT_EQ(0, run.status) << run.err;
    EXPECT_TRUE(synced);
    EXPECT_LT(4, changes);
    EXPECT_EQ(GetParam() == "mv", removals > 0);
}

}  // namespace
}  // namespace mavoea::test

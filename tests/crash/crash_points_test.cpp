// What a process that dies in the middle of an operation leaves behind: each operation is killed
// before every system call that it makes, and behind the last. What that costs stands in a table
// per operation, which docs/crashes.md tells in words.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/crash/crash_run.h"
#include "tests/crash/metadata.h"
#include "tests/crash/stream_operations.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_attributes.h"
#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/second_volume.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

#if defined(__SANITIZE_ADDRESS__)
// What the sanitizer keeps of freed memory is mapped anew for every process that is started here.
extern "C" const char* __asan_default_options();
extern "C" const char* __asan_default_options() { return "quarantine_size_mb=2"; }
#endif

namespace mavoea::test {
namespace {

// From the call `after` on, up to the next stage's, a crash costs `cost`; running the operation
// once more then gives `again`.
struct Stage {
    std::string after;
    std::string cost;
    std::string again = "done";
    bool operator==(const Stage&) const = default;
};

std::string Text(const std::vector<Stage>& stages) {
    std::string text;
    for (const Stage& stage : stages) {
        text += "         {\"" + stage.after + "\", \"" + stage.cost + "\"";
        if (stage.again != "done") text += ", \"" + stage.again + "\"";
        text += "},\n";
    }
    return text;
}

// The first of several stages in a row that cost the same.
void Append(Stage stage, std::vector<Stage>* stages) {
    if (!stages->empty() && stages->back().cost == stage.cost &&
        stages->back().again == stage.again) {
        return;
    }
    stages->push_back(std::move(stage));
}

// ---- Objects ------------------------------------------------------------------------------------

constexpr char kRecordItem[] = "record";
// Files of other services in the object's folder.
constexpr const char* kOthers[] = {"MAVOPreview", "MAVOThumb"};

// What the object of these tests has.
const Items& Wanted() {
    static const Items& items = *new Items{{"user.one", Pattern(300, 1)},
                                           {"user.two", Pattern(50, 2)},
                                           {kFinderItem, Pattern(32, 0x40)},
                                           {kForkItem, Pattern(3000, 4)}};
    return items;
}

bool IsAttribute(const std::string& name) { return name.starts_with("user."); }

// Two directories, "src" and "dst", with an object in each, "object"; on volumes that keep metadata
// in every place there is. Attributes of types 2 and 7 are the file's own; but no filesystem here
// has Macs' names, so that Finder info has another one, and the view "<object>/rsrc" is a file.
class World {
 public:
    explicit World(const std::string& other_volume = "") : dir_(FastDirectory()) {
        ResetKernel();
        ResetPlatform();
        src_.parent = dir_ / "src";
        dst_.parent = dir_ / "dst";
        if (!other_volume.empty()) {
            other_.emplace(other_volume);
            dst_.parent = *other_ / "dst";
        }
        src_.name = dst_.name = "object";
        for (const ObjectFiles& object : {src_, dst_}) {
            MakeDir(object.parent);
            object.MakeObject();
            WriteFile(ForkFile(object.object()), {});
        }
        StandIn();
    }
    ~World() {
        ResetKernel();
        ResetPlatform();
    }

    const ObjectFiles& src() const { return src_; }
    const ObjectFiles& dst() const { return dst_; }

    // Gives the source's object all that is wanted, where a volume of that type has it.
    void Fill(int type) const {
        const Items& wanted = Wanted();
        StreamImage stream;
        for (const auto& [name, value] : wanted) {
            if (IsAttribute(name)) stream.attributes.push_back({name, value});
        }
        if (type == 7) {
            for (const Attribute& attribute : stream.attributes) {
                SetAttribute(src_.object(), attribute.name, attribute.value);
            }
            SetAttribute(src_.object(), kMacFinderInfo, wanted.at(kFinderItem));
            WriteFile(ForkFile(src_.object()), wanted.at(kForkItem));
            return;
        }
        if (type == 0) {
            stream.finder_info = wanted.at(kFinderItem);
            stream.fork = wanted.at(kForkItem);
            WriteFile(src_.sidecar(), stream.Build());
            return;
        }
        MakeDir(src_.ea_dir());
        WriteFile(src_.stream(), stream.Build());
        WriteFile(src_.resource(), PlainAppleDouble(wanted.at(kFinderItem), wanted.at(kForkItem)));
        if (type == 2) {
            SetAttribute(src_.object(), "user.netatalk.Metadata", AttributeRecord());
        }
    }
    void AddOtherFiles() const {
        src_.MakeFolder();
        for (const char* const name : kOthers) {
            WriteFile(src_.folder() + "/" + name, Ascii(name));
        }
    }

    // What there is of the object's metadata where a volume of that type has it.
    static Items Found(const ObjectFiles& object, int type) {
        if (type == 0) return ItemsOfMacFile(object.sidecar());
        Items items;
        if (type == 7) {
            for (const std::string& name : NamesOf(object.object())) {
                const std::string item = name == kMacFinderInfo ? kFinderItem
                                         : name == kMacFork     ? kForkItem
                                                                : name;
                items[item] = AttributeOf(object.object(), name);
            }
            items[kForkItem] = ReadFile(ForkFile(object.object()));
            return items;
        }
        items = ItemsOfMacFile(object.resource());
        if (Exists(object.stream())) {
            const Look look = LookAtStream(object.stream());
            for (const auto& [name, value] : look.items) {
                if (IsAttribute(name)) items[name] = value;
            }
        }
        const Bytes record = AttributeOf(object.object(), "user.netatalk.Metadata");
        if (record.size() == 402) {
            items[kRecordItem] = Bytes(record.begin() + 122, record.begin() + 154);
        }
        for (const char* const name : kOthers) {
            const std::string other = object.folder() + "/" + name;
            if (Exists(other)) items[name] = ReadFile(other);
        }
        return items;
    }

    void ReadAll() const {
        ReadEverything(src_.parent);
        ReadEverything(dst_.parent);
    }

    // What lies at both ends, wherever those are this time.
    std::string Everything() const {
        std::string all;
        for (const ObjectFiles& end : {src_, dst_}) {
            std::string part = test::Everything(end.parent);
            for (auto at = part.find(end.parent); at != std::string::npos;
                 at = part.find(end.parent, at)) {
                part.erase(at, end.parent.size());
            }
            all += part + "\n";
        }
        return all;
    }

 private:
    static void StandIn() {
        KernelHooks& hooks = Hooks();
        hooks.fsync = [](int) { return 0; };
        hooks.sync = [] {};
        hooks.geteuid = [] { return uid_t{0}; };
        StandInForMacAttributes();
        hooks.archive = [](int) { return 0; };
        hooks.command = [](const char* path, int command) {
            return ::setxattr(path, kHiddenMark, &command, sizeof command, 0);
        };
        // What the commands say of files that are not there is no matter here.
        Platform().exec = RunCommand;
    }

    TempDir dir_;
    std::optional<TempDir> other_;
    ObjectFiles src_;
    ObjectFiles dst_;
};

// An operation, what there is before it, and what a crash in the middle costs.
struct Operation {
    std::string name;
    std::function<void(const World&)> prepare;
    std::function<int(const World&)> run;
    std::function<std::string(const World&)> cost;
    std::vector<Stage> stages;
    std::string other_volume = "";
};

// Processes are slow to come and go in these builds: of the points between two calls that change
// something on disk they take the first only.
#if defined(__SANITIZE_ADDRESS__)
constexpr bool kEveryPoint = false;
#else
constexpr bool kEveryPoint = !kEmulated;
#endif

bool OnlyLooks(const std::string& call) {
    static const std::set<std::string>& calls = *new std::set<std::string>{
        "access",  "close",     "closedir",  "fread", "fstat", "fsync",   "getcwd", "geteuid",
        "getlock", "getxattr",  "listxattr", "lseek", "lstat", "opendir", "pread",  "preadv",
        "readdir", "rewinddir", "setlock",   "stat",  "sync",  "time",
    };
    return calls.contains(call);
}

// Kills the operation at every point, compares what that costs with the table, and runs it again
// each time.
void KillEverywhere(const Operation& operation) {
    SCOPED_TRACE(operation.name);
    const auto fresh = [&] {
        auto world = std::make_unique<World>(operation.other_volume);
        operation.prepare(*world);
        return world;
    };
    std::string done;
    std::vector<std::string> calls;
    {
        const auto world = fresh();
        Hooks().before = [&](const std::string& name) { calls.push_back(name); };
        Platform().exec = [&](const std::vector<std::string>& argv) {
            calls.push_back(argv[0]);
            return RunCommand(argv);
        };
        EXPECT_EQ(0, operation.run(*world));
        Hooks().before = nullptr;
        Platform().exec = RunCommand;
        done = operation.cost(*world);
    }
    std::vector<Stage> found;
    std::string former;
    int points = 0;
    for (std::size_t made = 0; made <= calls.size(); ++made) {
        if (!kEveryPoint && made > 0 && OnlyLooks(calls[made - 1])) continue;
        ++points;
        const auto world = fresh();
        CrashRun crash;
        const auto body = [&] { return operation.run(*world); };
        ASSERT_NO_FATAL_FAILURE(crash.DieBefore(static_cast<int>(made) + 1, body));
        EXPECT_EQ(made == calls.size(), crash.finished()) << made;
        EXPECT_EQ(0, crash.result());
        // Most calls change nothing on disk: what holds behind one held before it.
        std::string left = world->Everything();
        if (left != former) {
            world->ReadAll();
            Stage stage = {crash.last(), operation.cost(*world)};
            const int result = operation.run(*world);
            const std::string afterwards = operation.cost(*world);
            if (result != 0 || afterwards != done) {
                stage.again = std::to_string(result) + ": " + afterwards;
            }
            Append(std::move(stage), &found);
        }
        former = std::move(left);
        (void)TakeCallNames();
    }
    EXPECT_TRUE(found == operation.stages) << "found:\n" << Text(found);
    printf("crash points: %s: %d\n", operation.name.c_str(), points);
}

// ---- Copies -------------------------------------------------------------------------------------

struct Pair {
    int from;
    int to;
    bool move;
    std::vector<Stage> stages;
};

// The others go in the order in which the directory has them: how many, not which.
std::set<std::string> Counted(std::set<std::string> names) {
    std::size_t others = 0;
    for (const char* const name : kOthers) others += names.erase(name);
    if (others != 0) names.insert(others == 1 ? "another file" : "other files");
    return names;
}

// What is whole at the source, what at the destination, what nowhere any more.
std::string CostOfCopy(const World& world, int from, int to, bool other_files) {
    Items at_src = Wanted();
    for (const char* const name : kOthers) {
        if (other_files) at_src[name] = Ascii(name);
    }
    Items at_dst = at_src;
    if (from == 2) at_src[kRecordItem] = Pattern(32, 0x40);
    if (to == 2) at_dst[kRecordItem] = Pattern(32, 0x40);
    const auto src = WholeIn(World::Found(world.src(), from), at_src);
    const auto dst = WholeIn(World::Found(world.dst(), to), at_dst);
    std::set<std::string> lost;
    for (const auto& [name, value] : at_src) {
        if (name != kRecordItem && !src.contains(name) && !dst.contains(name)) lost.insert(name);
    }
    const auto share = [](const std::set<std::string>& names, const Items& wanted) {
        return names.size() == wanted.size() ? "all" : Share(Counted(names), wanted);
    };
    return "src " + share(src, at_src) + "; dst " + share(dst, at_dst) +
           (lost.empty() ? "" : "; LOST " + Listed(Counted(lost)));
}

Operation CopyOf(const Pair& pair) {
    const auto [from, to, move, stages] = pair;
    const bool other_files = (from == 1 || from == 2) && (to == 1 || to == 2);
    return {
        .name = std::string(move ? "move" : "copy") + " from type " + std::to_string(from) +
                " to type " + std::to_string(to),
        .prepare =
            [from = from, other_files](const World& world) {
                world.Fill(from);
                if (other_files) world.AddOtherFiles();
            },
        .run =
            [from = from, to = to, move = move](const World& world) {
                std::string dst = world.dst().object();
                return MAVOEACopy(world.src().object().c_str(), dst.data(), move ? 1 : 0, 0, from,
                                  to, 0, 0);
            },
        .cost = [from = from, to = to, other_files](
                    const World& world) { return CostOfCopy(world, from, to, other_files); },
        .stages = stages,
    };
}

void CopyOver(const std::vector<Pair>& pairs) {
    for (const Pair& pair : pairs) KillEverywhere(CopyOf(pair));
}

// Promise: "What a crash costs: `tests/crash/crash_points_test.cpp` kills"
// Promise: "Copying: What has arrived"
// Promise: "Copying: Copying again"
// Promise: "Copying: AppleDouble to AppleDouble"
// Promise: "Copying: EA directory or file EA"
// Promise: "Copying: AppleDouble or attributes"
// Promise: "Copying: EA directory, file EA or attributes"
// Promise: "Copying: anything"
// Promise: "What may be left over: metadata at both ends of a copy"
TEST(CrashPointsTest, ACopyLeavesItsSourceWholeAndIsCompletedByAnother) {
    CopyOver({
        {0, 0, false, {{"", "src all; dst none"}, {"/bin/cp", "src all; dst all"}}},
        {0,
         1,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst all"}}},
        {0,
         2,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst Finder info, fork, user.one, user.two"},
          {"setxattr", "src all; dst all"}}},
        {0,
         7,
         false,
         {{"", "src all; dst none"},
          {"setxattr", "src all; dst user.one"},
          {"setxattr", "src all; dst user.one, user.two"},
          {"fclose", "src all; dst fork, user.one, user.two"},
          {"setxattr", "src all; dst all"}}},
        {1,
         0,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst Finder info, user.one"},
          {"pwrite", "src all; dst all"}}},
        {1,
         1,
         false,
         {{"", "src all; dst none"},
          {"/bin/cp", "src all; dst Finder info, fork"},
          {"/bin/cp", "src all; dst Finder info, fork, user.one, user.two"},
          {"/bin/cp", "src all; dst Finder info, another file, fork, user.one, user.two"},
          {"/bin/cp", "src all; dst all"}}},
        {1,
         2,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"/bin/cp", "src all; dst Finder info, fork, user.one, user.two"},
          {"setxattr", "src all; dst Finder info, fork, record, user.one, user.two"},
          {"/bin/cp", "src all; dst Finder info, another file, fork, record, user.one, user.two"},
          {"/bin/cp", "src all; dst all"}}},
        {1,
         7,
         false,
         {{"", "src all; dst none"},
          {"setxattr", "src all; dst user.one"},
          {"setxattr", "src all; dst user.one, user.two"},
          {"fclose", "src all; dst fork, user.one, user.two"},
          {"setxattr", "src all; dst all"}}},
        {2,
         0,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst Finder info, user.one"},
          {"pwrite", "src all; dst all"}}},
        {2,
         1,
         false,
         {{"", "src all; dst none"},
          {"/bin/cp", "src all; dst Finder info, fork"},
          {"/bin/cp", "src all; dst Finder info, fork, user.one, user.two"},
          {"/bin/cp", "src all; dst Finder info, another file, fork, user.one, user.two"},
          {"/bin/cp", "src all; dst all"}}},
        {2,
         2,
         false,
         {{"", "src all; dst none"},
          {"/bin/cp", "src all; dst Finder info, fork"},
          {"/bin/cp", "src all; dst Finder info, fork, user.one, user.two"},
          {"setxattr", "src all; dst Finder info, fork, record, user.one, user.two"},
          {"/bin/cp", "src all; dst Finder info, another file, fork, record, user.one, user.two"},
          {"/bin/cp", "src all; dst all"}}},
        {2,
         7,
         false,
         {{"", "src all; dst none"},
          {"setxattr", "src all; dst user.one"},
          {"setxattr", "src all; dst user.one, user.two"},
          {"fclose", "src all; dst fork, user.one, user.two"},
          {"setxattr", "src all; dst all"}}},
        {7,
         0,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst Finder info, user.one"},
          {"pwrite", "src all; dst all"}}},
        {7,
         1,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst all"}}},
        {7,
         2,
         false,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst Finder info, fork, user.one, user.two"},
          {"setxattr", "src all; dst all"}}},
        {7,
         7,
         false,
         {{"", "src all; dst none"},
          {"setxattr", "src all; dst Finder info"},
          {"fclose", "src all; dst Finder info, fork"},
          {"setxattr", "src all; dst Finder info, fork, user.one"},
          {"setxattr", "src all; dst all"}}},
    });
}

// Promise: "Moving: A move removes"
// Promise: "Moving: Every item"
// Promise: "Moving: A crash in one"
// Promise: "Moving: AppleDouble to any"
// Promise: "Moving: attributes to EA"
// Promise: "Moving: EA directory to attributes"
// Promise: "Moving: EA directory to AppleDouble"
// Promise: "Moving: EA directory to file EA"
// Promise: "Moving: file EA to file EA"
// Promise: "Moving: file EA to AppleDouble"
// Promise: "Moving: *Other files*"
// Promise: "Moving: A second move"
TEST(CrashPointsTest, AMoveHasEveryItemAtOneEndAtLeast) {
    CopyOver({
        {0,
         0,
         true,
         {{"", "src all; dst none"},
          {"/bin/cp", "src all; dst all"},
          {"unlink", "src none; dst all"}}},
        {0,
         1,
         true,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst all"},
          {"unlink", "src none; dst all"}}},
        {0,
         2,
         true,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst Finder info, fork, user.one, user.two"},
          {"unlink", "src none; dst Finder info, fork, user.one, user.two"},
          {"setxattr", "src none; dst all"}}},
        {0,
         7,
         true,
         {{"", "src all; dst none"},
          {"setxattr", "src all; dst user.one"},
          {"setxattr", "src all; dst user.one, user.two"},
          {"fclose", "src all; dst fork, user.one, user.two"},
          {"setxattr", "src all; dst all"},
          {"unlink", "src none; dst all"}}},
        {1,
         0,
         true,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"unlink", "src user.one, user.two; dst Finder info, fork"},
          {"pwrite", "src user.one, user.two; dst Finder info; LOST fork",
           "0: src none; dst Finder info, user.one, user.two; LOST fork"},
          {"pwrite", "src user.one, user.two; dst Finder info, fork, user.one"},
          {"pwrite", "src user.one, user.two; dst Finder info, user.one; LOST fork",
           "0: src none; dst Finder info, user.one, user.two; LOST fork"},
          {"pwrite", "src user.one, user.two; dst all"},
          {"unlink", "src none; dst all"}}},
        {1,
         1,
         true,
         {{"", "src all; dst none"},
          {"/bin/cp", "src all; dst Finder info, fork"},
          {"unlink", "src other files, user.one, user.two; dst Finder info, fork"},
          {"/bin/cp",
           "src other files, user.one, user.two; dst Finder info, fork, user.one, user.two"},
          {"unlink", "src other files; dst Finder info, fork, user.one, user.two"},
          {"/bin/mv", "src another file; dst Finder info, another file, fork, user.one, user.two",
           "0: src none; dst Finder info, another file, fork, user.one, user.two; LOST another "
           "file"},
          {"/bin/mv", "src none; dst all"}}},
        {1,
         2,
         true,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"unlink", "src other files, user.one, user.two; dst Finder info, fork",
           "0: src user.one, user.two; dst Finder info, fork, other files"},
          {"/bin/cp",
           "src other files, user.one, user.two; dst Finder info, fork, user.one, user.two",
           "0: src user.one, user.two; dst Finder info, fork, other files, user.one, user.two"},
          {"unlink", "src other files; dst Finder info, fork, user.one, user.two",
           "0: src none; dst Finder info, fork, other files, user.one, user.two"},
          {"setxattr", "src other files; dst Finder info, fork, record, user.one, user.two"},
          {"/bin/mv",
           "src another file; dst Finder info, another file, fork, record, user.one, user.two",
           "0: src none; dst Finder info, another file, fork, record, user.one, user.two; LOST "
           "another file"},
          {"/bin/mv", "src none; dst all"}}},
        {1,
         7,
         true,
         {{"", "src all; dst none"},
          {"setxattr", "src all; dst user.one"},
          {"setxattr", "src all; dst user.one, user.two"},
          {"unlink", "src Finder info, fork; dst user.one, user.two"},
          {"fclose", "src Finder info, fork; dst fork, user.one, user.two"},
          {"setxattr", "src Finder info, fork; dst all"},
          {"unlink", "src none; dst all"}}},
        {2,
         0,
         true,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"unlink", "src record, user.one, user.two; dst Finder info, fork",
           "0: src none; dst Finder info, user.one, user.two; LOST fork"},
          {"pwrite", "src record, user.one, user.two; dst Finder info; LOST fork",
           "0: src none; dst Finder info, user.one, user.two; LOST fork"},
          {"pwrite", "src record, user.one, user.two; dst Finder info, fork, user.one",
           "0: src none; dst Finder info, user.one, user.two; LOST fork"},
          {"pwrite", "src record, user.one, user.two; dst Finder info, user.one; LOST fork",
           "0: src none; dst Finder info, user.one, user.two; LOST fork"},
          {"pwrite", "src record, user.one, user.two; dst all",
           "0: src none; dst Finder info, user.one, user.two; LOST fork"},
          {"unlink", "src record; dst all",
           "0: src none; dst Finder info; LOST fork, user.one, user.two"},
          {"removexattr", "src none; dst all"}}},
        {2,
         1,
         true,
         {{"", "src all; dst none"},
          {"/bin/cp", "src all; dst Finder info, fork"},
          {"unlink", "src other files, record, user.one, user.two; dst Finder info, fork",
           "0: src none; dst Finder info, other files, user.one, user.two; LOST fork"},
          {"/bin/cp",
           "src other files, record, user.one, user.two; dst Finder info, fork, user.one, user.two",
           "0: src none; dst Finder info, other files, user.one, user.two; LOST fork"},
          {"unlink", "src other files, record; dst Finder info, fork, user.one, user.two",
           "0: src none; dst Finder info, other files, user.one, user.two; LOST fork"},
          {"removexattr", "src other files; dst Finder info, fork, user.one, user.two"},
          {"/bin/mv", "src another file; dst Finder info, another file, fork, user.one, user.two",
           "0: src none; dst Finder info, another file, fork, user.one, user.two; LOST another "
           "file"},
          {"/bin/mv", "src none; dst all",
           "0: src none; dst Finder info, fork, user.one, user.two; LOST other files"},
          {"/bin/rm", "src none; dst all"}}},
        {2,
         2,
         true,
         {{"", "src all; dst none"},
          {"/bin/cp", "src all; dst Finder info, fork"},
          {"unlink", "src other files, record, user.one, user.two; dst Finder info, fork"},
          {"/bin/cp",
           "src other files, record, user.one, user.two; dst Finder info, fork, user.one, "
           "user.two"},
          {"unlink", "src other files, record; dst Finder info, fork, user.one, user.two"},
          {"setxattr",
           "src other files, record; dst Finder info, fork, record, user.one, user.two"},
          {"/bin/mv",
           "src another file, record; dst Finder info, another file, fork, record, user.one, "
           "user.two",
           "0: src record; dst Finder info, another file, fork, record, user.one, user.two; LOST "
           "another file"},
          {"/bin/mv", "src record; dst all",
           "0: src record; dst Finder info, fork, record, user.one, user.two; LOST other files"},
          {"/bin/rm", "src record; dst all"}}},
        {2,
         7,
         true,
         {{"", "src all; dst none"},
          {"setxattr", "src all; dst user.one"},
          {"setxattr", "src all; dst user.one, user.two"},
          {"unlink", "src Finder info, fork, record; dst user.one, user.two"},
          {"fclose", "src Finder info, fork, record; dst fork, user.one, user.two"},
          {"setxattr", "src Finder info, fork, record; dst all"},
          {"unlink", "src record; dst all"},
          {"removexattr", "src none; dst all"}}},
        {7,
         1,
         true,
         {{"", "src all; dst none"},
          {"pwrite", "src all; dst Finder info, fork"},
          {"pwrite", "src all; dst Finder info, fork, user.one"},
          {"pwrite", "src all; dst all"}}},
    });
}

// ---- Renames ------------------------------------------------------------------------------------

ObjectFiles Renamed(const World& world) { return {world.src().parent, "renamed"}; }

// The caller has renamed the object before it has the metadata follow.
void RenameObject(const World& world, const ObjectFiles& to) {
    (void)RunCommand({"/bin/mv", "-f", world.src().object(), to.object()});
}

void FillLegacy(const World& world) {
    const ObjectFiles& object = world.src();
    object.MakeFolder();
    const Items& wanted = Wanted();
    for (const auto& [name, value] : wanted) {
        if (IsAttribute(name)) WriteFile(object.folder() + "/" + name, value);
    }
    WriteFile(object.folder() + "/MAVO:Resource",
              PlainAppleDouble(wanted.at(kFinderItem), wanted.at(kForkItem)));
}

Items FoundLegacy(const ObjectFiles& object) {
    Items items = ItemsOfMacFile(object.folder() + "/MAVO:Resource");
    for (const auto& [name, value] : Wanted()) {
        const std::string file = object.folder() + "/" + name;
        if (Exists(file)) items[name] = ReadFile(file);
    }
    return items;
}

// The attributes go in the order in which the directory has them: how many, not which.
std::string Count(const std::set<std::string>& names, const Items& wanted) {
    const auto attributes = std::count_if(names.begin(), names.end(), IsAttribute);
    if (names.size() == wanted.size() || attributes != 1) return Share(names, wanted);
    std::set<std::string> counted = {"an attribute"};
    for (const std::string& name : names) {
        if (!IsAttribute(name)) counted.insert(name);
    }
    return Listed(counted);
}

// `places`: what each has of the wanted items.
std::string CostOfMoving(const std::vector<std::pair<std::string, Items>>& places,
                         const Items& wanted = Wanted()) {
    std::string text;
    std::set<std::string> lost;
    for (const auto& [name, value] : wanted) lost.insert(name);
    for (const auto& [place, items] : places) {
        const auto whole = WholeIn(items, wanted);
        text += (text.empty() ? "" : "; ") + place + " " + Count(whole, wanted);
        for (const std::string& name : whole) lost.erase(name);
    }
    return text + (lost.empty() ? "" : "; LOST " + Listed(lost));
}

Operation RenameOf(const std::string& name, int type, bool to_dst, std::vector<Stage> stages,
                   const std::string& other_volume = "") {
    const auto target = [to_dst](const World& world) {
        return to_dst ? world.dst() : Renamed(world);
    };
    return {
        .name = name,
        .prepare =
            [=](const World& world) {
                world.Fill(type);
                RenameObject(world, target(world));
            },
        .run =
            [=](const World& world) {
                return MAVOEARename(world.src().object().c_str(), target(world).object().c_str(),
                                    type, nullptr);
            },
        .cost =
            [=](const World& world) {
                return CostOfMoving({{"old", World::Found(world.src(), type)},
                                     {"new", World::Found(target(world), type)}});
            },
        .stages = std::move(stages),
        .other_volume = other_volume,
    };
}

// Promise: "Renaming: Resource file, stream"
// Promise: "Renaming: Renaming again"
// Promise: "What may be left over: `<old>@MavoEAStream`"
TEST(CrashPointsTest, ARenameHasEveryItemUnderOneOfTheNamesAndIsCompletedByAnother) {
    KillEverywhere(RenameOf("rename in a directory, type 1", 1, false,
                            {{"", "old all; new none"},
                             {"rename", "old user.one, user.two; new Finder info, fork"},
                             {"rename", "old none; new all"}}));
    KillEverywhere(RenameOf("rename to another directory, type 1", 1, true,
                            {{"", "old all; new none"},
                             {"rename", "old user.one, user.two; new Finder info, fork"},
                             {"rename", "old none; new all"}}));
    KillEverywhere(RenameOf("rename in a directory, type 0", 0, false,
                            {{"", "old all; new none"}, {"rename", "old none; new all"}}));
    KillEverywhere(RenameOf("rename to another directory, type 0", 0, true,
                            {{"", "old all; new none"}, {"rename", "old none; new all"}}));
}

// Promise: "Renaming: Across volumes"
TEST(CrashPointsTest, ARenameToAnotherVolumeHasEveryItemUnderOneOfTheNames) {
    const SecondVolume volume("", true);
    if (!volume.ok()) GTEST_SKIP() << "there is no second volume";
    KillEverywhere(RenameOf("rename to another volume, type 1", 1, true,
                            {{"", "old all; new none"},
                             {"/bin/mv", "old user.one, user.two; new Finder info, fork"},
                             {"/bin/mv", "old none; new all"}},
                            volume.path()));
}

// Where a "._" file of an object stood that has been replaced.
// Promise: "Renaming: On AppleDouble volumes"
TEST(CrashPointsTest, ARenameOverAnObjectCostsThatOnesAppleDoubleFileFirst) {
    Operation operation = RenameOf("rename over another object, type 0", 0, true,
                                   {{"", "old all; new none; the other's there"},
                                    {"remove", "old all; new none"},
                                    {"rename", "old none; new all"}});
    operation.prepare = [prepare = operation.prepare](const World& world) {
        prepare(world);
        world.dst().MakeSidecar();
    };
    operation.cost = [cost = operation.cost](const World& world) {
        const std::string file = world.dst().sidecar();
        const bool there = Exists(file) && ReadFile(file) == Ascii("sidecar of object");
        return cost(world) + (there ? "; the other's there" : "");
    };
    KillEverywhere(operation);
}

// Promise: "Renaming: Attribute files"
// Promise: "Renaming: If that was"
TEST(CrashPointsTest, ARenameOfLegacyMetadataHasEveryItemInOneOfThreePlaces) {
    Operation operation = RenameOf(
        "rename of legacy metadata, type 1", 1, true,
        {{"", "folder all; old none; new none; new folder none"},
         {"rename", "folder user.one, user.two; old Finder info, fork; new none; new folder none"},
         {"rename", "folder user.one, user.two; old none; new Finder info, fork; new folder none"},
         {"link",
          "folder user.one, user.two; old user.one, user.two; new Finder info, fork; new folder "
          "none",
          "0: folder none; old none; new all; new folder user.one, user.two"},
         {"unlink",
          "folder an attribute; old user.one, user.two; new Finder info, fork; new folder none",
          "0: folder none; old none; new all; new folder an attribute"},
         {"unlink", "folder none; old user.one, user.two; new Finder info, fork; new folder none"},
         {"rename", "folder none; old none; new all; new folder none"}});
    operation.prepare = [](const World& world) {
        FillLegacy(world);
        RenameObject(world, world.dst());
    };
    operation.cost = [](const World& world) {
        return CostOfMoving({{"folder", FoundLegacy(world.src())},
                             {"old", World::Found(world.src(), 1)},
                             {"new", World::Found(world.dst(), 1)},
                             {"new folder", FoundLegacy(world.dst())}});
    };
    KillEverywhere(operation);
}

// ---- Upgrades -----------------------------------------------------------------------------------

Operation UpgradeOf(const std::string& name, const std::string& kind,
                    std::function<void(const World&)> prepare,
                    std::function<std::string(const World&)> cost, std::vector<Stage> stages) {
    return {
        .name = name,
        .prepare = std::move(prepare),
        .run =
            [kind](const World& world) {
                const int result = MAVOEAUpgrade(world.src().object().c_str(), kind.c_str());
                return result == 1 ? 0 : result;  // It is current already.
            },
        .cost = std::move(cost),
        .stages = std::move(stages),
    };
}

// Attributes of several pages each, but for one.
const Items& LegacyAttributes() {
    static const Items& items = *new Items{{"user.one", Pattern(9000, 1)},
                                           {"user.two", Pattern(50, 2)},
                                           {"user.three", Pattern(13000, 3)}};
    return items;
}
Items ResourceOnly() {
    Items items = Wanted();
    std::erase_if(items, [](const auto& item) { return IsAttribute(item.first); });
    return items;
}

void FillLegacyAttributes(const World& world) {
    world.src().MakeFolder();
    for (const auto& [name, value] : LegacyAttributes()) {
        WriteFile(world.src().folder() + "/" + name, value);
    }
}

// Nothing in a folder is looked at once there is a stream: what that lacks is out of sight.
std::string CostOfUpgrade(const World& world) {
    const Items& wanted = LegacyAttributes();
    const bool current = Exists(world.src().stream());
    const Items now = current ? LookAtStream(world.src().stream()).items : Items{};
    std::size_t files = 0;
    for (const auto& [name, value] : wanted) {
        const std::string file = world.src().folder() + "/" + name;
        const bool is_file = Exists(file) && ReadFile(file) == value;
        files += is_file ? 1 : 0;
        const auto at = now.find(name);
        const bool is_attribute = at != now.end() && at->second == value;
        if (!is_file && !is_attribute) return "LOST " + name;
        if (current && !is_attribute) return "out of sight: " + name;
    }
    return std::to_string(files) + " files" + (current ? " and the stream" : "");
}

Operation UpgradeOfAttributes() {
    return UpgradeOf("upgrade of attribute files", MAVOEA_KIND_STREAM, FillLegacyAttributes,
                     CostOfUpgrade,
                     {{"", "3 files"},
                      {"link", "3 files and the stream", "0: 3 files and the stream"},
                      {"unlink", "2 files and the stream", "0: 2 files and the stream"},
                      {"unlink", "1 files and the stream", "0: 1 files and the stream"},
                      {"unlink", "0 files and the stream"}});
}

// Promise: "What a crash costs: Nothing is repaired by itself"
// Promise: "Upgrading: attribute files"
TEST(CrashPointsTest, AnUpgradeLosesNothingAndPutsNothingOutOfSight) {
    KillEverywhere(UpgradeOfAttributes());
}

// The file has no name yet.
TEST(CrashPointsTest, AnUpgradeThatIsCutShortWithinAWriteHasDoneNothing) {
    const Operation operation = UpgradeOfAttributes();
    std::set<std::string> found;
    int points = 0;
    bool more = true;
    for (int nth = 1; more; ++nth) {
        for (std::size_t bytes = 4096; bytes < 23000; bytes += 4096) {
            const World world;
            operation.prepare(world);
            CrashRun crash;
            ASSERT_NO_FATAL_FAILURE(
                crash.DieWithin(nth, bytes, [&] { return operation.run(world); }));
            more = crash.writes() >= nth;
            if (!more) break;
            ++points;
            found.insert(operation.cost(world));
            EXPECT_EQ(1u, NamesIn(world.src().ea_dir()).size());
            (void)TakeCallNames();
        }
    }
    EXPECT_EQ((std::set<std::string>{"3 files"}), found);
    printf("crash points: within the writes of: %s: %d\n", operation.name.c_str(), points);
}

// Promise: "Upgrading: a legacy"
// Promise: "Upgrading: a "._" file"
// Promise: "Upgrading: another"
TEST(CrashPointsTest, AnUpgradeOfOneFileIsDoneOrNot) {
    KillEverywhere(
        UpgradeOf("upgrade of a legacy resource file", MAVOEA_KIND_RESOURCE, FillLegacy,
                  [](const World& world) {
                      const std::string object = world.src().object();
                      const bool mode = (ModeOf(object) & 0222) == 0222;
                      const bool hidden = getxattr(object.c_str(), kHiddenMark, nullptr, 0) > 0;
                      return CostOfMoving({{"folder", FoundLegacy(world.src())},
                                           {"current", World::Found(world.src(), 1)}},
                                          ResourceOnly()) +
                             (mode ? hidden ? "; marks all" : "; marks read-only" : "; marks none");
                  },
                  {{"", "folder all; current none; marks none"},
                   {"rename", "folder none; current all; marks none",
                    "0: folder none; current all; marks none"},
                   {"chmod", "folder none; current all; marks read-only",
                    "0: folder none; current all; marks read-only"},
                   {"command", "folder none; current all; marks all"}}));
    KillEverywhere(UpgradeOf(
        "upgrade of an AppleDouble file", MAVOEA_KIND_STREAM,
        [](const World& world) { world.Fill(0); },
        [](const World& world) {
            return CostOfMoving({{"._ file", World::Found(world.src(), 0)},
                                 {"stream", ItemsOfMacFile(world.src().stream())}});
        },
        {{"", "._ file all; stream none"}, {"rename", "._ file none; stream all"}}));
    KillEverywhere(UpgradeOf(
        "upgrade of another reserved file", "MAVO:x",
        [](const World& world) { world.src().MakeLegacy("MAVO:x"); },
        [](const World& world) {
            const std::string folder = world.src().folder();
            return std::string(Exists(folder + "/MAVO:x") ? "old name" : "") +
                   (Exists(folder + "/MAVO@x") ? "new name" : "");
        },
        {{"", "old name"}, {"/bin/mv", "new name"}}));
}

// ---- Repairs ------------------------------------------------------------------------------------

// Promise: "Repairing: The attributes"
// Promise: "Repairing: Until then"
// Promise: "Repairing: repairing again"
// Promise: "What may be left over: `@eaDir/<name>@MavoResourceTmp`"
TEST(CrashPointsTest, ARepairLosesNothingAndIsCompletedByAnother) {
    const auto unfinished = [](const World& world) { return world.src().resource() + "Tmp"; };
    KillEverywhere({
        .name = "repair of a resource file",
        .prepare =
            [](const World& world) {
                world.Fill(0);
                MakeDir(world.src().ea_dir());
                (void)RunCommand({"/bin/mv", world.src().sidecar(), world.src().resource()});
            },
        .run = [](const World& world) { return MAVOEAFixErrorAD(world.src().object().c_str()); },
        .cost =
            [=](const World& world) {
                Items stream;
                if (Exists(world.src().stream())) stream = LookAtStream(world.src().stream()).items;
                return CostOfMoving({{"resource file", ItemsOfMacFile(world.src().resource())},
                                     {"stream", stream}}) +
                       (Exists(unfinished(world)) ? "; unfinished" : "");
            },
        .stages = {{"", "resource file all; stream none"},
                   {"open", "resource file all; stream none; unfinished"},
                   {"pwrite", "resource file all; stream an attribute; unfinished"},
                   {"pwrite", "resource file all; stream user.one, user.two; unfinished"},
                   {"rename", "resource file Finder info, fork; stream user.one, user.two"}},
    });
}

// ---- Removals -----------------------------------------------------------------------------------

std::string Left(const World& world) {
    const ObjectFiles& object = world.src();
    std::set<std::string> left;
    if (Exists(object.sidecar())) left.insert("._ file");
    if (Exists(object.stream())) left.insert("stream");
    if (Exists(object.resource())) left.insert("resource file");
    if (Exists(object.folder())) {
        const auto count = NamesIn(object.folder()).size();
        left.insert("folder of " + std::to_string(count));
    }
    if (Exists(object.ea_dir())) left.insert("EA directory");
    return left.empty() ? "nothing left" : "left: " + Listed(left);
}

Operation ObjectRemovalOf(const std::string& name, int type, std::vector<Stage> stages) {
    return {
        .name = name,
        .prepare =
            [type](const World& world) {
                world.Fill(type);
                FillLegacy(world);
                if (unlink(world.src().object().c_str()) != 0) abort();
            },
        .run =
            [type](const World& world) {
                return MAVOEARemove(world.src().object().c_str(), type, nullptr);
            },
        .cost = Left,
        .stages = std::move(stages),
    };
}

// Promise: "Removing: Each file is unlinked"
// Promise: "Removing: What a crash leaves"
// Promise: "Removing: Removing again"
// Promise: "What may be left over: `@eaDir` or"
TEST(CrashPointsTest, ARemovalLeavesFilesOfAnObjectThatIsGoneAndIsCompletedByAnother) {
    KillEverywhere(
        ObjectRemovalOf("remove an object, type 1", 1,
                        {{"", "left: EA directory, folder of 3, resource file, stream"},
                         {"unlink", "left: EA directory, folder of 2, resource file, stream"},
                         {"unlink", "left: EA directory, folder of 1, resource file, stream"},
                         {"unlink", "left: EA directory, folder of 0, resource file, stream"},
                         {"remove", "left: EA directory, resource file, stream"},
                         {"unlink", "left: EA directory, stream"},
                         {"unlink", "left: EA directory"},
                         {"rmdir", "nothing left"}}));
    KillEverywhere(
        ObjectRemovalOf("remove an object, type 0", 0,
                        {{"", "left: ._ file, EA directory, folder of 3"},
                         {"unlink", "left: EA directory, folder of 3"},
                         {"unlink", "left: EA directory, folder of 2"},
                         {"unlink", "left: EA directory, folder of 1"},
                         {"unlink", "left: EA directory, folder of 0", "0: left: EA directory"},
                         {"remove", "left: EA directory", "0: left: EA directory"},
                         {"rmdir", "nothing left"}}));
}

// Promise: "Removing: `MAVOEARemoveDanglingEADir`"
TEST(CrashPointsTest, ADanglingEADirectoryIsThereOrNot) {
    KillEverywhere({
        .name = "remove a dangling EA directory",
        .prepare =
            [](const World& world) {
                world.Fill(1);
                for (const char* const name : {"object", "object.fork"}) {
                    if (unlink((world.src().parent + "/" + name).c_str()) != 0) abort();
                }
            },
        .run =
            [](const World& world) {
                MAVOEARemoveDanglingEADir(world.src().parent.c_str());
                return 0;
            },
        .cost = Left,
        .stages = {{"", "left: EA directory, resource file, stream"}, {"/bin/rm", "nothing left"}},
    });
}

// ---- Last steps ---------------------------------------------------------------------------------

// What is told of an object is noted where no operation on these volumes looks: with the file of a
// fork on another kind of volume.
std::string NotesOf(const World& world) { return ForkFile(world.dst().object()); }
std::string NameOfNote(const std::string& note) { return "user.note." + note; }

void TakeNotes(const World& world) {
    const auto take = [&](const std::string& note) {
        if (::setxattr(NotesOf(world).c_str(), NameOfNote(note).c_str(), "", 0, 0) != 0) abort();
        return 0;
    };
    Hooks().archive = [=](int) { return take("archive bit"); };
    Platform().index = [=](const std::string& call) {
        if (Hooks().before) Hooks().before("index");
        return take(call.starts_with("MLIBMavoFileIndexAdd") ? "file index" : "index");
    };
}

// By the rights of the object or, as the platform does, by a mark.
bool IsLocked(const std::string& object) {
    constexpr int kSetLocked = 522;
    int command = 0;
    const ssize_t size = ::getxattr(object.c_str(), kHiddenMark, &command, sizeof command);
    return (ModeOf(object) & 0222) == 0 || (size == sizeof command && command == kSetLocked);
}

// Which of them have been made.
std::string LastSteps(const World& world) {
    const ObjectFiles& dst = world.dst();
    std::set<std::string> made;
    if (Exists(dst.resource()) && ModeOf(dst.resource()) == 0777) made.insert("resource's mode");
    if (Exists(dst.stream()) && ModeOf(dst.stream()) == 0777) made.insert("stream's mode");
    if (IsLocked(dst.object())) made.insert("lock");
    for (const char* const note : {"archive bit", "index", "file index"}) {
        if (::getxattr(NotesOf(world).c_str(), NameOfNote(note).c_str(), nullptr, 0) == 0) {
            made.insert(note);
        }
    }
    return made.empty() ? "none" : Listed(made);
}

// From an object without write bits, which are the lock where volumes keep it in the mode.
Operation LastStepsOfCopy(int from, int to, bool move, std::vector<Stage> stages) {
    return {
        .name = std::string("last steps of a ") + (move ? "move" : "copy") + " from type " +
                std::to_string(from) + " to type " + std::to_string(to),
        .prepare =
            [=](const World& world) {
                world.Fill(from);
                TakeNotes(world);
                if (::chmod(world.src().object().c_str(), 0444) != 0) abort();
            },
        .run =
            [=](const World& world) {
                std::string dst = world.dst().object();
                return MAVOEACopy(world.src().object().c_str(), dst.data(), move ? 1 : 0, 0, from,
                                  to, 1, 1);
            },
        .cost = LastSteps,
        .stages = std::move(stages),
    };
}

// Promise: "Last steps: These come last"
// Promise: "Last steps: Running the operation again"
TEST(CrashPointsTest, WhatAnOperationDoesLastIsMadeUpForByAnother) {
    const Umask mask(022);
    for (const bool move : {false, true}) {
        KillEverywhere(LastStepsOfCopy(0, 0, move,
                                       {{"", "none"},
                                        {"chmod", "lock"},
                                        {"archive", "archive bit, lock"},
                                        {"index", "archive bit, index, lock"},
                                        {"index", "archive bit, file index, index, lock"}}));
        KillEverywhere(LastStepsOfCopy(
            0, 1, move,
            {{"", "none"},
             {"fchmod", "resource's mode"},
             {"fchmod", "resource's mode, stream's mode"},
             {"command", "lock, resource's mode, stream's mode"},
             {"archive", "archive bit, lock, resource's mode, stream's mode"},
             {"index", "archive bit, index, lock, resource's mode, stream's mode"},
             {"index", "archive bit, file index, index, lock, resource's mode, stream's mode"}}));
    }
    KillEverywhere(LastStepsOfCopy(
        1, 1, false,
        {{"", "none"},
         {"fchmod", "resource's mode"},
         {"fchmod", "resource's mode, stream's mode"},
         {"archive", "archive bit, resource's mode, stream's mode"},
         {"index", "archive bit, index, resource's mode, stream's mode"},
         {"index", "archive bit, file index, index, resource's mode, stream's mode"}}));
    Operation rename = RenameOf("last steps of a rename, type 1", 1, true,
                                {{"", "none"},
                                 {"index", "index"},
                                 {"index", "file index, index"},
                                 {"archive", "archive bit, file index, index"}});
    rename.prepare = [prepare = rename.prepare](const World& world) {
        prepare(world);
        TakeNotes(world);
    };
    rename.cost = LastSteps;
    KillEverywhere(rename);
    Operation removal =
        ObjectRemovalOf("last steps of a removal, type 1", 1,
                        {{"", "none"}, {"index", "index"}, {"index", "file index, index"}});
    removal.prepare = [prepare = removal.prepare](const World& world) {
        prepare(world);
        TakeNotes(world);
    };
    removal.cost = LastSteps;
    KillEverywhere(removal);
}

// Promise: "Last steps: The mode of a file"
TEST(CrashPointsTest, AFileThatAMoveHasTakenFromItsSourceMayKeepItsMode) {
    const Umask mask(022);
    const std::string without_resource = "0: archive bit, file index, index, stream's mode";
    const std::string without_stream = "0: archive bit, file index, index, resource's mode";
    KillEverywhere(LastStepsOfCopy(
        1, 1, true,
        {{"", "none"},
         {"unlink", "none", without_resource},
         {"fchmod", "resource's mode"},
         {"unlink", "resource's mode", without_stream},
         {"fchmod", "resource's mode, stream's mode"},
         {"archive", "archive bit, resource's mode, stream's mode"},
         {"index", "archive bit, index, resource's mode, stream's mode"},
         {"index", "archive bit, file index, index, resource's mode, stream's mode"}}));
}

// ---- EA directories -----------------------------------------------------------------------------

// A directory that is there is left as it is, so that what one lacks it lacks for good.
// Promise: "Last steps: An EA directory"
// Promise: "Last steps: Later calls"
TEST(CrashPointsTest, AnEADirectoryThatWasJustMadeMayNotBeOpenToEverybody) {
    constexpr char kAclName[] = "user.test.acl";
    const Umask mask(022);
    KillEverywhere({
        .name = "make an EA directory",
        .prepare =
            [=](const World&) {
                Platform().acl = [=](const std::string& path) {
                    if (Hooks().before) Hooks().before("acl");
                    return ::setxattr(path.c_str(), kAclName, "", 0, 0);
                };
            },
        .run = [](const World& world) { return MAVOEAMKDir(0, world.src().ea_dir().c_str()); },
        .cost = [=](const World& world) -> std::string {
            const std::string dir = world.src().ea_dir();
            if (!Exists(dir)) return "none";
            if (ModeOf(dir) != 0777) return "narrow mode, no ACL";
            return ::getxattr(dir.c_str(), kAclName, nullptr, 0) < 0 ? "no ACL" : "whole";
        },
        .stages = {{"", "none"},
                   {"mkdir", "narrow mode, no ACL", "0: narrow mode, no ACL"},
                   {"fchmod", "no ACL", "0: no ACL"},
                   {"acl", "whole"}},
    });
}

// ---- The fork on an attribute volume ------------------------------------------------------------

std::string CostOfFork(const World& world) {
    const Bytes fork = ReadFile(ForkFile(world.src().object()));
    const std::string text = fork == Wanted().at(kForkItem) ? "old"
                             : fork == Pattern(6000, 9)     ? "new"
                             : fork.empty()                 ? "LOST fork"
                                                            : "LOST fork: a part of the new one";
    const bool widened = (ModeOf(world.src().object()) & S_IXUSR) != 0;
    return text + (widened ? "; object executable" : "");
}

// Promise: "The fork on an attribute volume: Opening"
// Promise: "The fork on an attribute volume: A crash"
// Promise: "The fork on an attribute volume: until"
TEST(CrashPointsTest, AForkOnAnAttributeVolumeIsEmptiedBeforeItIsWritten) {
    KillEverywhere({
        .name = "set the fork of an object, type 7",
        .prepare = [](const World& world) { world.Fill(7); },
        .run =
            [](const World& world) {
                const Bytes fork = Pattern(6000, 9);
                return MAVOEAXattrSet(world.src().object().c_str(), kMacFork, fork.data(),
                                      static_cast<int>(fork.size()), 0);
            },
        .cost = CostOfFork,
        .stages = {{"", "old"},
                   {"chmod", "old; object executable", "0: new; object executable"},
                   {"fopen", "LOST fork; object executable", "0: new; object executable"},
                   {"fwrite", "LOST fork: a part of the new one; object executable",
                    "0: new; object executable"},
                   {"fclose", "new; object executable", "0: new; object executable"},
                   {"chmod", "new"}},
    });
}

// ---- Streams ------------------------------------------------------------------------------------

std::string StreamPath(const World& world) { return world.src().parent + "/stream"; }

// The operation on the stream at that path.
int OnFile(const std::string& path, const std::function<int(int)>& run) {
    const int fd = ::open(path.c_str(), O_RDWR);
    const int result = run(fd);
    ::close(fd);
    return result;
}

std::string CostAt(const StreamOperation& operation, const std::string& path) {
    std::string cost;
    (void)OnFile(path, [&](int fd) {
        cost = CostOfStream(operation, fd).Text();
        return 0;
    });
    return cost;
}

Operation OnStream(const StreamOperation& operation, std::vector<Stage> stages) {
    return {
        .name = operation.name,
        .prepare = [=](const World& world) { WriteFile(StreamPath(world), operation.before); },
        .run = [=](const World& world) { return OnFile(StreamPath(world), operation.run); },
        .cost = [=](const World& world) { return CostAt(operation, StreamPath(world)); },
        .stages = std::move(stages),
    };
}

void KillOnStream(const StreamOperation& operation, std::vector<Stage> stages) {
    KillEverywhere(OnStream(operation, std::move(stages)));
}

constexpr std::size_t kSize = 300;
constexpr std::size_t kFork = 40000;

// Promise: "Streams: Without a fork"
TEST(CrashPointsTest, AWriteToAStreamWithoutAForkIsDoneOrNot) {
    KillOnStream(WriteToAnEmptyFile(), {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(WriteOf("write a new attribute", kSize, 0, std::nullopt, 500),
                 {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(WriteOf("overwrite an attribute", kSize, 0, 300, 300),
                 {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(WriteOf("make an attribute longer", kSize, 0, 300, 500),
                 {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(TruncationOf("make an attribute shorter", kSize, 0, 100),
                 {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(RemovalOf("remove an attribute", kSize, 0), {{"", "old"}, {"pwrite", "new"}});
}

// Promise: "What a crash costs: In every state that they reach"
// Promise: "Streams: A stream is rewritten in place"
// Promise: "Streams: a write that makes"
// Promise: "Streams: an overwrite"
// Promise: "Streams: a removal"
// Promise: "Streams: `MAVOEASTruncate`"
// Promise: "Repairing: But each"
TEST(CrashPointsTest, AForkThatMovesMayBeLostAndSoMayTheLastValues) {
    KillOnStream(
        WriteOf("write a new attribute before a fork", kSize, kFork, std::nullopt, 500),
        {{"", "old"}, {"pwrite", "old; LOST fork", "0: new; LOST fork"}, {"pwrite", "new"}});
    KillOnStream(WriteOf("overwrite an attribute before a fork", kSize, kFork, 300, 300),
                 {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(
        WriteOf("make an attribute before a fork longer", kSize, kFork, 300, 500),
        {{"", "old"}, {"pwrite", "old; LOST fork", "0: new; LOST fork"}, {"pwrite", "new"}});
    KillOnStream(
        TruncationOf("make an attribute before a fork shorter", kSize, kFork, 100),
        {{"", "old"}, {"pwrite", "new; LOST fork", "0: new; LOST fork"}, {"pwrite", "new"}});
    KillOnStream(RemovalOf("remove an attribute before a fork", kSize, kFork),
                 {{"", "old"},
                  {"pwrite", "LOST the value; LOST c, fork", "0: new; LOST c, fork"},
                  {"pwrite", "new"}});
}

// Which is what imports and repairs do.
// Promise: "Streams: a replacement by an import"
// Promise: "Streams: a replacement by a shorter"
TEST(CrashPointsTest, AReplacementHasOneOfTheTwoValues) {
    for (const std::size_t size : {100u, 300u, 500u}) {
        KillOnStream(ReplacementOf("replace an attribute", kSize, 0, size),
                     {{"", "old"}, {"pwrite", "new"}});
    }
    KillOnStream(ReplacementOf("replace an attribute before a fork", kSize, kFork, kSize),
                 {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(
        ReplacementOf("replace an attribute before a fork by a longer one", kSize, kFork, 500),
        {{"", "old"}, {"pwrite", "old; LOST fork", "0: new; LOST fork"}, {"pwrite", "new"}});
    KillOnStream(
        ReplacementOf("replace an attribute before a fork by a shorter one", kSize, kFork, 100),
        {{"", "old"}, {"pwrite", "new; LOST fork", "0: new; LOST fork"}, {"pwrite", "new"}});
}

// Promise: "Streams: Finder info, a netatalk record"
TEST(CrashPointsTest, FinderInfoIsWrittenInOneCall) {
    KillEverywhere({
        .name = "write Finder info",
        .prepare = [](const World& world) { world.Fill(1); },
        .run =
            [](const World& world) {
                const Bytes finder_info = Pattern(32, 0x11);
                return MAVOEAEADirFSFInfoWrite(world.src().object().c_str(), finder_info.data());
            },
        .cost = [](const World& world) -> std::string {
            const Items now = ItemsOfMacFile(world.src().resource());
            if (!now.contains(kForkItem) || now.at(kForkItem) != Wanted().at(kForkItem))
                return "LOST";
            return now.at(kFinderItem) == Pattern(32, 0x40)   ? "old"
                   : now.at(kFinderItem) == Pattern(32, 0x11) ? "new"
                                                              : "LOST Finder info";
        },
        .stages = {{"", "old"}, {"pwrite", "new"}},
    });
}

// A signal stops the kernel in the middle of a write as well, behind one of its pages.
void KillWithinWrites(const StreamOperation& operation, const std::set<std::string>& costs) {
    SCOPED_TRACE(operation.name);
    constexpr std::size_t kPage = 4096;
    std::set<std::string> found;
    int points = 0;
    bool more = true;
    for (int nth = 1; more; ++nth) {
        for (std::size_t bytes = kPage; bytes <= operation.before.size(); bytes += kPage) {
            const World world;
            const std::string path = StreamPath(world);
            WriteFile(path, operation.before);
            CrashRun crash;
            ASSERT_NO_FATAL_FAILURE(
                crash.DieWithin(nth, bytes, [&] { return OnFile(path, operation.run); }));
            more = crash.writes() >= nth;
            if (!more) break;
            ++points;
            found.insert(CostAt(operation, path));
            (void)TakeCallNames();
        }
    }
    EXPECT_EQ(costs, found);
    printf("crash points: within the writes of: %s: %d\n", operation.name.c_str(), points);
}

// Promise: "What a crash costs: In every state that they reach"
// Promise: "Streams: A larger one"
// Promise: "Streams: Then the pages"
// Promise: "Streams: The value that was written"
// Promise: "Streams: where table and values"
// Promise: "Repairing: But each"
TEST(CrashPointsTest, AWriteOfSeveralPagesThatIsCutShortMayCostEveryValue) {
    constexpr std::size_t kLarge = 6000;
    KillWithinWrites(WriteOf("write a new attribute", kLarge, 0, std::nullopt, 500),
                     {"LOST the value; LOST a, c", "LOST the value; LOST c"});
    KillWithinWrites(WriteOf("overwrite an attribute", kLarge, 0, kLarge, kLarge),
                     {"LOST the value", "LOST the value; LOST c"});
    KillWithinWrites(WriteOf("make an attribute longer", kLarge, 0, kLarge, kLarge + 500),
                     {"LOST the value", "LOST the value; LOST c"});
    KillWithinWrites(TruncationOf("make an attribute shorter", kLarge, 0, 100),
                     {"LOST the value; LOST c", "new"});
    KillWithinWrites(RemovalOf("remove an attribute", kLarge, 0),
                     {"new", "new; LOST a, c", "new; LOST c"});
    KillWithinWrites(WriteOf("make an attribute before a fork longer", kLarge, kFork, kLarge, 6500),
                     {"LOST the value", "LOST the value; LOST c", "new", "old; LOST fork"});
    KillWithinWrites(RemovalOf("remove an attribute before a fork", kLarge, kFork),
                     {"LOST the value; LOST c", "LOST the value; LOST c, fork", "new",
                      "new; LOST a, c", "new; LOST c"});
}

// Beyond 64 KiB header and table go out first, then what changes of the values.
constexpr std::size_t kVeryLarge = 30000;

// Promise: "Streams: Of one that is larger"
// Promise: "Streams: Values that an overwrite"
TEST(CrashPointsTest, AnOverwriteInALargeStreamCostsNothingBeforeWhatIsWritten) {
    KillOnStream(
        WriteOf("overwrite an attribute of a large stream", kVeryLarge, 0, kVeryLarge, kVeryLarge),
        {{"", "old"}, {"pwrite", "LOST the value; LOST c", "0: new; LOST c"}, {"pwrite", "new"}});
    KillOnStream(WriteOfLast("overwrite the last of a large stream", kVeryLarge, 0, kVeryLarge),
                 {{"", "old"}, {"pwrite", "new"}});
    KillOnStream(
        WriteOfLast("make the last of a large stream longer", kVeryLarge, 0, kVeryLarge + 500),
        {{"", "old"}, {"pwrite", "LOST the value"}, {"pwrite", "new"}});
    KillOnStream(WriteOfLast("overwrite the last before a fork", kVeryLarge, kFork, kVeryLarge),
                 {{"", "old"}, {"pwrite", "new"}});
}

// Promise: "Streams: if it was the last"
TEST(CrashPointsTest, AnOverwriteInALargeStreamThatIsCutShortCostsWhatIsWrittenAndWhatMoves) {
    KillWithinWrites(
        WriteOf("overwrite an attribute of a large stream", kVeryLarge, 0, kVeryLarge, kVeryLarge),
        {"LOST the value", "LOST the value; LOST c", "new"});
    KillWithinWrites(WriteOfLast("overwrite the last of a large stream", kVeryLarge, 0, kVeryLarge),
                     {"LOST the value", "new"});
}

}  // namespace
}  // namespace mavoea::test

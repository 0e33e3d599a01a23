// Looking changes nothing: what only shows, compares or copies from leaves no trace, finds earlier
// layouts where they lie, and says so when it could not look.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <map>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/second_volume.h"
#include "tests/support/snapshot.h"
#include "tests/tool/holdings.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr uid_t kStranger = 54321;

// user: rwx; user 2: r-x; group: r-x; mask: r-x; others: none.
Bytes AccessAcl() {
    return Hex(
        "02 00 00 00  01 00 07 00 FF FF FF FF  02 00 05 00 02 00 00 00  04 00 05 00 FF FF FF FF"
        "10 00 05 00 FF FF FF FF  20 00 00 00 FF FF FF FF");
}

Bytes ColourStream() {
    return StreamImage{.attributes = {{"user.colour", Ascii("blue")}}, .fork = Ascii("fork")}
        .Build();
}

std::vector<std::string> Lines(const std::string& text) {
    std::vector<std::string> lines;
    std::size_t at = 0;
    for (std::size_t end = 0; (end = text.find('\n', at)) != std::string::npos; at = end + 1) {
        lines.push_back(text.substr(at, end - at));
    }
    return lines;
}

// The names that a list has, in any order.
std::vector<std::string> Listed(const ToolResult& result) {
    std::vector<std::string> names = Lines(result.out);
    std::sort(names.begin(), names.end());
    return names;
}

void SetAccessTime(const std::string& path, std::int64_t seconds) {
    timespec times[2] = {};
    times[0].tv_sec = static_cast<time_t>(seconds);
    times[1].tv_nsec = UTIME_OMIT;
    ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW)) << path;
}

// ---- A tree with everything that a volume of a type may hold ------------------------------------

class World {
 public:
    World(int type, const std::string& top) : type_(type), top_(top) {
        MakeDir(top_);
        MakePlain();
        if (type == 7) {
            MakeRealAttributes();
        } else {
            MakeAppleDoubles();
            MakeLegacy();
        }
        if (UsesEaDirectory(type)) MakeCurrent();
        if (type == 2) MakeRecords();
        SetOldTimes(top_);
    }

    int type() const { return type_; }
    const std::string& top() const { return top_; }
    std::string operator/(const std::string& name) const { return top_ + '/' + name; }
    const std::vector<std::string>& objects() const { return objects_; }

    // Files that hold metadata, wherever they are in the tree.
    std::vector<std::string> MetadataFiles() const {
        std::vector<std::string> files;
        for (const auto& [path, aspects] : TakeSnapshot(top_)) {
            const std::string name = fs::path(path).filename().string();
            if (aspects.at("type") == "file" &&
                (name.starts_with("._") || name.find("MavoEAStream") != std::string::npos ||
                 name.find("Resource") != std::string::npos)) {
                files.push_back(*this / path);
            }
        }
        return files;
    }

    // What declares it, in front of a command.
    Arguments Declared(Arguments arguments) const {
        arguments.insert(arguments.begin(), {"--volume", top_ + "=" + std::to_string(type_)});
        return arguments;
    }

 private:
    std::string Add(const std::string& name) {
        objects_.push_back(*this / name);
        if (!Exists(objects_.back())) WriteFile(objects_.back(), Ascii("data of " + name));
        return objects_.back();
    }
    std::string AddDirectory(const std::string& name) {
        MakeDir(*this / name);
        return Add(name);
    }

    void MakePlain() {
        const std::string plain = Add("plain");
        SetFileAttribute(plain, "system.posix_acl_access", AccessAcl());
        ASSERT_EQ(0, lchown(plain.c_str(), kStranger, kStranger));
        ASSERT_EQ(0, chmod(Add("read-only").c_str(), 0444));
        ASSERT_EQ(0, chmod(Add("program").c_str(), 0755));
        ASSERT_EQ(0, link(plain.c_str(), (*this / "second name").c_str()));
        ASSERT_EQ(0, symlink("plain", (*this / "link").c_str()));
        ASSERT_EQ(0, mkfifo((*this / "pipe").c_str(), 0644));
        SetMarks(Add("marked"), kHiddenMarkBit | kLockedMark);
    }

    void MakeAppleDoubles() {
        int number = 0;
        for (const MacFile& file : AllMacFiles()) {
            const std::string name = "mac" + std::to_string(number++);
            PutAppleDouble(number % 3 == 0 ? AddDirectory(name) : Add(name), file.bytes);
        }
        number = 0;
        for (const SampleFile& sample : SampleFiles()) {
            PutAppleDouble(Add("sample" + std::to_string(number++)), sample.bytes);
        }
        PutAppleDouble(Add("text"), Ascii("not what its name says"));
        PutAppleDouble(Add("nothing"), {});
        PutAppleDouble(*this / "gone", AllMacFiles()[0].bytes);
    }

    // Below a directory that has some itself.
    void MakeLegacy() {
        const std::string sub = AddDirectory("sub");
        PutLegacy(sub, "color", Ascii("white"));
        for (const char* below : {"", "sub/"}) {
            const std::string prefix = below;
            const std::string attributes = Add(prefix + "attributes");
            PutLegacy(attributes, "color", Ascii("blue"));
            PutLegacy(attributes, "tags", Pattern(3000));
            PutLegacy(attributes, "empty", {});
            PutLegacy(Add(prefix + "resource"), "MAVO:Resource",
                      NetatalkFile(Pattern(32, 1), Pattern(5000, 2)).bytes);
            const std::string services = Add(prefix + "services");
            PutLegacy(services, "MAVO:x", Ascii("x"));
            PutLegacy(services, "MAVOplain", Ascii("plain"));
            PutLegacy(services, "MAVOPHOTO:THUMB_S.jpg", Pattern(600));
            PutLegacy(services, "a:b", Ascii("no attribute"));
            const std::string both = Add(prefix + "both");
            PutLegacy(both, "color", Ascii("red"));
            PutAppleDouble(both, AllMacFiles()[1].bytes);
        }
        PutLegacy(*this / "gone", "color", Ascii("of nothing"));
    }

    void MakeCurrent() {
        PutStream(Add("stream"), ColourStream());
        PutStream(Add("mac stream"), AllMacFiles()[0].bytes);
        PutResource(Add("classic"), AllMacFiles()[5].bytes);
        PutResource(Add("netatalk"), AllMacFiles()[9].bytes);
        const std::string all = AddDirectory("all");
        PutStream(all, ColourStream());
        PutResource(all, AllMacFiles()[9].bytes);
        PutLegacy(all, "color", Ascii("forgotten"));
        PutAppleDouble(all, AllMacFiles()[3].bytes);
        PutKind(all, "OtherKind", Ascii("of another service"));
        PutResource(Add("to repair"), ColourStream());
        PutStream(*this / "gone", ColourStream());
    }

    void MakeRecords() {
        const std::string record = Add("record");
        SetFileAttribute(record, kRecordAttribute,
                         RecordOf({.finder_info = Pattern(32, 5), .comment = Ascii("comment")}));
        const std::string differing = Add("differing");
        SetFileAttribute(differing, kRecordAttribute, RecordOf({.finder_info = Pattern(32, 6)}));
        PutResource(differing, AllMacFiles()[5].bytes);
    }

    void MakeRealAttributes() {
        for (const mode_t mode : {0644U, 0600U, 0444U, 0755U}) {
            const std::string file = Add("mode" + std::to_string(mode));
            SetFileAttribute(file, "user.colour", Ascii("blue"));
            SetFileAttribute(file, "user.empty", {});
            PutAppleDouble(file, AllMacFiles()[0].bytes);
            ASSERT_EQ(0, chmod(file.c_str(), mode));
        }
        SetFileAttribute(AddDirectory("sub"), "user.colour", Ascii("red"));
        SetFileAttribute(Add("sub/file"), "user.colour", Ascii("red"));
    }

    int type_;
    std::string top_;
    std::vector<std::string> objects_;
};

// ---- Commands that only look --------------------------------------------------------------------

using Runs = std::vector<Arguments>;

struct Look {
    std::string label;
    std::function<Runs(const World&)> runs;
    // Where it makes something of its own; "DST" in its arguments.
    const char* destination_type = nullptr;
};

Runs OfEach(const std::vector<std::string>& paths, const Arguments& before,
            const Arguments& after = {}) {
    Runs runs;
    for (const std::string& path : paths) {
        Arguments arguments = before;
        arguments.push_back(path);
        arguments.insert(arguments.end(), after.begin(), after.end());
        runs.push_back(arguments);
    }
    return runs;
}

Runs OfAll(const std::vector<std::string>& paths, Arguments arguments) {
    arguments.insert(arguments.end(), paths.begin(), paths.end());
    return {arguments};
}

// Values in some of the layouts, and what is nowhere: some of them for each object, all in turn.
Runs Gets(const World& world) {
    static const std::vector<std::string> names = {
        kFinderInfoName, "user.colour", "com.apple.FinderComment", kForkName, "color",
        kLockedName,     "user.none"};
    const std::size_t step = world.type() == 7 ? 1 : 4;
    Runs runs;
    std::size_t turn = 0;
    for (const std::string& object : world.objects()) {
        for (const std::string& name : names) {
            if (turn++ % step == 0) runs.push_back({"get", object, name});
        }
    }
    return runs;
}

std::vector<Look> ShowingLooks() {
    return {
        {"Where", [](const World& world) { return OfEach(world.objects(), {"where"}); }},
        {"List", [](const World& world) { return OfAll(world.objects(), {"list"}); }},
        {"LongList",
         [](const World& world) {
             return OfAll(world.objects(), {"list", "-l"});
         }},
        {"JsonList",
         [](const World& world) {
             return OfAll(world.objects(), {"--json", "list"});
         }},
        {"ListOfATree",
         [](const World& world) {
             return Runs{{"list", "-r", world.top()}, {"list", "-l", "-r", world.top()}};
         }},
        {"Show", [](const World& world) { return OfAll(world.objects(), {"show"}); }},
        {"ShowOfATree",
         [](const World& world) {
             return Runs{{"show", "-r", world.top()}, {"--json", "show", "-r", world.top()}};
         }},
        {"Save",
         [](const World& world) {
             return Runs{{"save", "-r", world.top()}, {"save", "--encoding", "hex", world.top()}};
         }},
        {"Get", Gets},
        {"Dump", [](const World& world) { return OfEach(world.MetadataFiles(), {"dump"}); }},
        {"DumpOfRecords",
         [](const World& world) {
             return OfEach(world.objects(), {"dump", "--record"});
         }},
        {"DumpOfAttributes",
         [](const World& world) {
             return OfEach(world.objects(), {"dump", "--attributes"});
         }},
        {"ExportToStandardOutput",
         [](const World& world) { return OfEach(world.objects(), {"export"}, {"-"}); }},
        {"Clean",
         [](const World& world) {
             return Runs{{"clean", "-r", world.top()}, {"clean", "-r", "--all", world.top()}};
         }},
        {"Check",
         [](const World& world) {
             return Runs{{"check", "-r", world.top()}, {"--json", "check", "-r", world.top()}};
         }},
        {"Plan",
         [](const World& world) {
             return Runs{
                 {"plan", "-r", "--to", "samba", world.top(), world.top() + "-copy"},
                 {"--json", "plan", "-r", "--to", "eadir", world.top(), world.top() + "-copy"}};
         }},
        {"CheckOfObjects", [](const World& world) { return OfAll(world.objects(), {"check"}); }},
    };
}

std::vector<Look> AllLooks() {
    std::vector<Look> looks = ShowingLooks();
    for (const char* type : {"0", "1", "2", "7"}) {
        looks.push_back({std::string("CopyTo") + type,
                         [](const World& world) {
                             return Runs{{"cp", "-r", world.top(), "DST"}};
                         },
                         type});
        looks.push_back({std::string("ConvertTo") + type,
                         [type](const World& world) {
                             return Runs{{"convert", "-r", "--to", type, world.top(), "DST/copy"}};
                         },
                         type});
    }
    for (const char* format : {"appledouble", "applesingle", "macbinary", "binhex"}) {
        looks.push_back({std::string("ExportAs") + format,
                         [format](const World& world) {
                             return OfEach(world.objects(),
                                           {"export", "--force", "--format", format},
                                           {"DST/exported"});
                         },
                         "1"});
    }
    looks.push_back({"Import",
                     [](const World& world) {
                         Runs runs;
                         for (const std::string& file : world.MetadataFiles()) {
                             runs.push_back({"import", file, "DST/object"});
                         }
                         return runs;
                     },
                     "1"});
    return looks;
}

struct Case {
    int type;
    Look look;
};
std::vector<Case> Cases(const std::vector<Look>& looks) {
    std::vector<Case> cases;
    for (const int type : Types({0, 1, 2, 7})) {
        for (const Look& look : looks) cases.push_back({type, look});
    }
    return Thinned(cases);
}
void PrintTo(const Case& tested, std::ostream* out) {
    *out << tested.look.label << " on type " << tested.type;
}
std::string NameOf(const ::testing::TestParamInfo<Case>& info) {
    return info.param.look.label + "Type" + std::to_string(info.param.type);
}

class LookTest : public ::testing::TestWithParam<Case> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
        MAVOEA_SKIP_UNLESS_ANYONE_OWNS(dir_.path());
        MakeDir(Destination());
        WriteFile(Destination() + "/object", {});
    }

    std::string Destination() const { return dir_ / "destination"; }

    // Runs each of them, or each `step`th; what they said and how they ended, in order.
    std::vector<ToolResult> RunAll(const World& world, std::size_t step = 1, uid_t user = 0) const {
        const Look& look = GetParam().look;
        std::vector<ToolResult> results;
        const Runs runs = look.runs(world);
        for (std::size_t i = 0; i < runs.size(); i += step * SeriesStep()) {
            Arguments run = runs[i];
            for (std::string& word : run) {
                if (word.starts_with("DST")) word.replace(0, 3, Destination());
            }
            run = world.Declared(run);
            if (look.destination_type != nullptr) {
                run.insert(run.begin(), {"--volume", Destination() + "=" + look.destination_type});
            }
            results.push_back(RunTool(run, {}, {.user = user}));
        }
        return results;
    }

    const TempDir dir_{FastDirectory()};
};

TEST_P(LookTest, NothingOfTheTreeChanges) {
    const World world(GetParam().type, dir_ / "source");
    const Snapshot before = TakeSnapshot(world.top());
    for (const ToolResult& result : RunAll(world)) {
        EXPECT_THAT(result.status, AnyOf(0, 1, 2)) << ::testing::PrintToString(result);
    }
    EXPECT_THAT(Differences(before, TakeSnapshot(world.top())), IsEmpty());
}
INSTANTIATE_TEST_SUITE_P(EveryLook, LookTest, ::testing::ValuesIn(Cases(AllLooks())), NameOf);

class ShowTest : public LookTest {};
INSTANTIATE_TEST_SUITE_P(EveryLook, ShowTest, ::testing::ValuesIn(Cases(ShowingLooks())), NameOf);

// Of a long series of runs some will do for each of the ways to run them.
constexpr std::size_t kSome = 3;

// The same is seen again where nothing can be written, and by whom nothing may be.
void ExpectSame(const std::vector<ToolResult>& expected, const std::vector<ToolResult>& results) {
    ASSERT_EQ(expected.size(), results.size());
    for (std::size_t i = 0; i < expected.size(); ++i) {
        EXPECT_EQ(expected[i].status, results[i].status);
        EXPECT_EQ(expected[i].out, results[i].out);
        EXPECT_EQ(expected[i].err, results[i].err);
    }
}

TEST_P(ShowTest, AReadOnlyVolumeShowsTheSame) {
    const SecondVolume second("", true);
    if (!second.ok()) GTEST_SKIP() << "nothing can be mounted here; run this test as the root";
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second.path());
    const World world(GetParam().type, second.path() + "/source");
    ASSERT_EQ(0, mount(nullptr, second.path().c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr));
    const std::vector<ToolResult> results = RunAll(world, kSome);
    ASSERT_EQ(0, mount(nullptr, second.path().c_str(), nullptr, MS_REMOUNT, nullptr));
    SetOldTimes(world.top());
    ExpectSame(RunAll(world, kSome), results);
}

TEST_P(ShowTest, WhoMayNotWriteIsShownTheSame) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    const World world(GetParam().type, dir_ / "source");
    // What root alone may read is no longer the same.
    for (const std::string& object : world.objects()) {
        ASSERT_EQ(0, chmod(object.c_str(), fs::is_directory(object) ? 0755 : 0644));
    }
    SetOldTimes(world.top());
    const Snapshot before = TakeSnapshot(world.top());
    const std::vector<ToolResult> results = RunAll(world, kSome, kStranger);
    EXPECT_THAT(Differences(before, TakeSnapshot(world.top()), {"atime"}), IsEmpty());
    SetOldTimes(world.top());
    ExpectSame(RunAll(world, kSome), results);
}

TEST_P(ShowTest, OwnersKeepTheirAccessTimes) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    const World world(GetParam().type, dir_ / "source");
    for (const auto& entry : fs::recursive_directory_iterator(world.top())) {
        ASSERT_EQ(0, lchown(entry.path().c_str(), kStranger, kStranger));
    }
    ASSERT_EQ(0, lchown(world.top().c_str(), kStranger, kStranger));
    SetOldTimes(world.top());
    const Snapshot before = TakeSnapshot(world.top());
    RunAll(world, kSome, kStranger);
    EXPECT_THAT(Differences(before, TakeSnapshot(world.top())), IsEmpty());
}

// ---- Comparing looks at two trees ---------------------------------------------------------------

struct Two {
    int from;
    int to;
};
std::vector<Two> EveryTwo() {
    std::vector<Two> all;
    for (const int from : Types({0, 1, 2, 7})) {
        for (const int to : Types({0, 1, 2, 7})) all.push_back({from, to});
    }
    return Thinned(all);
}

void PrintTo(const Two& two, std::ostream* out) {
    *out << "from type " << two.from << " to type " << two.to;
}

class CompareTest : public ::testing::TestWithParam<Two> {};
INSTANTIATE_TEST_SUITE_P(EveryTwo, CompareTest, ::testing::ValuesIn(EveryTwo()),
                         [](const auto& tested) {
                             return "From" + std::to_string(tested.param.from) + "To" +
                                    std::to_string(tested.param.to);
                         });

TEST_P(CompareTest, NeitherSideChanges) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const TempDir dir(FastDirectory());
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir.path());
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS(dir.path());
    const World from(GetParam().from, dir / "from");
    const World to(GetParam().to, dir / "to");
    const Snapshot before = TakeSnapshot(dir.path());
    const ToolResult result =
        RunTool(to.Declared(from.Declared({"diff", "-r", "--data", from.top(), to.top()})));
    EXPECT_THAT(result.status, AnyOf(0, 1, 2));
    EXPECT_THAT(Differences(before, TakeSnapshot(dir.path())), IsEmpty());
}

// ---- Earlier layouts where they lie -------------------------------------------------------------

class EarlierTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume_.path());
    }

    std::string object() const { return volume_.object(); }
    MetadataPaths paths() const { return MetadataPaths(object()); }
    ToolResult LongList() const { return volume_.Run({"list", "-l", object()}); }
    Bytes Get(const std::string& name) const { return volume_.Get(name).bytes(); }

    // An object that has only such an AppleDouble file: all of it is shown, with its place.
    static void ExpectShown(const std::string& label, const Bytes& bytes,
                            const MacContents& contents) {
        SCOPED_TRACE(label);
        const Volume volume(GetParam(), FastDirectory());
        WriteFile(volume.apple_double(), bytes);
        std::map<std::string, Bytes> wanted = contents.attributes;
        if (contents.finder_info != Repeat(0, 32)) wanted[kFinderInfoName] = contents.finder_info;
        if (!contents.fork.empty()) wanted[kForkName] = contents.fork;
        const ToolResult list = volume.Run({"list", "-l", volume.object()});
        EXPECT_THAT(list, Succeeded());
        std::vector<std::string> lines = Lines(list.out);
        std::erase_if(lines, [](const std::string& line) {  // which says nothing of a place
            return line.find(kLockedName) != std::string::npos;
        });
        EXPECT_THAT(lines, Each(HasSubstr("  " + volume.apple_double())));
        const std::vector<std::string> listed = Lines(volume.List().out);
        for (const auto& [name, value] : wanted) {
            EXPECT_THAT(listed, Contains(name));
            EXPECT_EQ(value, volume.Get(name).bytes()) << name;
        }
        EXPECT_EQ(bytes, BytesIn(volume.apple_double()));
    }

    // Adopted, as a note says.
    void ExpectNote(const ToolResult& result) const {
        EXPECT_EQ(0, result.status) << result.err;
        EXPECT_THAT(Lines(result.err), Contains(HasSubstr("mavoea: note: " + object() + ": ")));
    }

    const Volume volume_{GetParam(), FastDirectory()};
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, EarlierTest, ::testing::ValuesIn(Types({1, 2, 3, 6, 10})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(EarlierTest, AppleDoubleFilesAreReadWhereTheyLie) {
    for (const MacFile& file : AllMacFiles()) {
        MacContents shown = file.contents;
        if (file.ForkInUse().empty()) shown.fork.clear();
        ExpectShown(file.layout, file.bytes, shown);
    }
}

TEST_P(EarlierTest, RealAppleDoubleFilesAreReadWhereTheyLie) {
    if (SampleFiles().empty()) GTEST_SKIP() << kNoSampleFiles;
    for (const SampleFile& sample : SampleFiles()) {
        if (sample.contents) ExpectShown(sample.name, sample.bytes, *sample.contents);
    }
}

TEST_P(EarlierTest, AttributeFilesAreReadWhereTheyLie) {
    PutLegacy(object(), "color", Ascii("blue"));
    PutLegacy(object(), "tags", Pattern(3000));
    PutLegacy(object(), "MAVO:x", Ascii("no attribute"));
    PutLegacy(object(), "a:b", Ascii("no attribute"));
    EXPECT_THAT(Listed(volume_.List()), ElementsAre("color", "tags"));
    const ToolResult list = LongList();
    EXPECT_THAT(list, Succeeded());
    EXPECT_THAT(list.out, HasSubstr("color  " + paths().folder + "/color\n"));
    EXPECT_THAT(list.out, HasSubstr("tags   " + paths().folder + "/tags\n"));
    EXPECT_EQ(Ascii("blue"), Get("color"));
    EXPECT_EQ(Pattern(3000), Get("tags"));
    EXPECT_EQ(1, volume_.Get("MAVO:x").status);
    EXPECT_EQ(1, volume_.Get("a:b").status);
    EXPECT_FALSE(Exists(volume_.stream()));
}

TEST_P(EarlierTest, LegacyResourceFilesAreReadWhereTheyLie) {
    const MacFile file = ThirteenEntryFile(Pattern(32, 1), Pattern(5000, 2));
    PutLegacy(object(), "MAVO:Resource", file.bytes);
    const ToolResult list = LongList();
    EXPECT_THAT(list, Succeeded());
    std::vector<std::string> lines = Lines(list.out);
    ASSERT_EQ(3U, lines.size());
    EXPECT_THAT(lines.back(), HasSubstr(kLockedName));  // which its AFP word says
    lines.pop_back();
    EXPECT_THAT(lines, Each(HasSubstr("  " + paths().folder + "/MAVO:Resource")));
    EXPECT_THAT(Listed(volume_.List()), ElementsAre(kFinderInfoName, kForkName, kLockedName));
    EXPECT_EQ(file.contents.finder_info, Get(kFinderInfoName));
    EXPECT_EQ(file.contents.fork, Get(kForkName));
    EXPECT_FALSE(Exists(volume_.resource()));
}

TEST_P(EarlierTest, WhatWasReadLastIsShownAndStaysIt) {
    constexpr std::int64_t kTime = 1500000000;
    const struct {
        std::int64_t color;
        std::int64_t tags;
        std::int64_t apple_double;
        std::vector<std::string> shown;
    } cases[] = {
        {kTime, kTime - 9, kTime - 1, {"color", "tags"}},
        {kTime - 9, kTime, kTime - 1, {"color", "tags"}},
        {kTime, kTime, kTime, {"a"}},
        {kTime, kTime, kTime + 1, {"a"}},
    };
    for (const auto& times : cases) {
        PutLegacy(object(), "color", Ascii("blue"));
        PutLegacy(object(), "tags", Ascii("new"));
        PutAppleDouble(object(), StreamImage{.attributes = {{"a", Ascii("1")}}}.Build());
        SetAccessTime(paths().folder + "/color", times.color);
        SetAccessTime(paths().folder + "/tags", times.tags);
        SetAccessTime(paths().apple_double, times.apple_double);
        for (int again = 0; again < 2; ++again) {
            EXPECT_EQ(times.shown, Listed(volume_.List()));
            EXPECT_EQ(times.shown[0] == "a" ? "1" : "", volume_.Get("a").out);
            volume_.Get("color");
            LongList();
        }
    }
}

TEST_P(EarlierTest, AStreamIsShownBeforeThem) {
    PutStream(object(), ColourStream());
    PutLegacy(object(), "color", Ascii("blue"));
    PutAppleDouble(object(), StreamImage{.attributes = {{"a", Ascii("1")}}}.Build());
    EXPECT_THAT(Listed(volume_.List()), Contains("user.colour"));
    EXPECT_EQ(1, volume_.Get("color").status);
    EXPECT_EQ(1, volume_.Get("a").status);
}

TEST_P(EarlierTest, WhatIsNoAppleDoubleFileIsNoMetadata) {
    Bytes version1 = AllMacFiles()[0].bytes;
    version1[5] = 1;
    for (const Bytes& bytes : {Ascii("text"), Bytes(), version1}) {
        WriteFile(volume_.apple_double(), bytes);
        const ToolResult list = volume_.List();
        EXPECT_THAT(list, Succeeded());
        EXPECT_EQ("", list.out);
        EXPECT_EQ(bytes, BytesIn(volume_.apple_double()));
    }
}

// ---- Adopting them ------------------------------------------------------------------------------

TEST_P(EarlierTest, SettingAdoptsAnAppleDoubleFileAndSaysSo) {
    const MacFile file = MacSidecar({{{"a", Ascii("1")}}, Pattern(32, 1), Pattern(500, 2)});
    PutAppleDouble(object(), file.bytes);
    ExpectNote(volume_.Set("user.new", Ascii("new")));
    EXPECT_FALSE(Exists(volume_.apple_double()));
    const Holdings found = HoldingsOf(GetParam(), object());
    EXPECT_TRUE(found.HasAttribute({"user.new", Ascii("new")}));
    EXPECT_TRUE(found.HasAttribute({"a", Ascii("1")}));
    EXPECT_TRUE(found.HasFinderInfo(Pattern(32, 1)));
    EXPECT_TRUE(found.HasFork(Pattern(500, 2)));
    EXPECT_EQ(Pattern(32, 1), Get(kFinderInfoName));
    EXPECT_EQ(Pattern(500, 2), Get(kForkName));
}

TEST_P(EarlierTest, SettingFinderInfoOrForkAdoptsAsWell) {
    for (const char* name : {kFinderInfoName, kForkName}) {
        const MacFile file = MacSidecar({{{"a", Ascii("1")}}, Pattern(32, 1), Pattern(500, 2)});
        const Volume volume(GetParam(), FastDirectory());
        WriteFile(volume.apple_double(), file.bytes);
        const ToolResult result = volume.Set(name, Pattern(32, 7));
        EXPECT_EQ(0, result.status) << result.err;
        EXPECT_THAT(result.err, HasSubstr("mavoea: note: " + volume.object() + ": "));
        EXPECT_EQ("1", volume.Get("a").out);
        const bool set_fork = name == std::string(kForkName);
        EXPECT_EQ(Pattern(32, set_fork ? 1 : 7), volume.Get(kFinderInfoName).bytes());
        EXPECT_EQ(set_fork ? Pattern(32, 7) : Pattern(500, 2), volume.Get(kForkName).bytes());
    }
}

TEST_P(EarlierTest, SettingAdoptsALegacyFolderAndSaysSo) {
    PutLegacy(object(), "color", Ascii("blue"));
    PutLegacy(object(), "MAVO:Resource", PlainAppleDouble(Pattern(32, 1), Pattern(500, 2)));
    PutLegacy(object(), "MAVOPHOTO:THUMB_S.jpg", Pattern(600));
    ExpectNote(volume_.Set("user.new", Ascii("new")));
    const Holdings found = HoldingsOf(GetParam(), object());
    EXPECT_TRUE(found.HasAttribute({"user.new", Ascii("new")}));
    EXPECT_TRUE(found.HasAttribute({"color", Ascii("blue")}));
    EXPECT_TRUE(found.HasFinderInfo(Pattern(32, 1)));
    EXPECT_TRUE(found.HasFork(Pattern(500, 2)));
    EXPECT_EQ(1U, found.others.size());
    EXPECT_FALSE(Exists(paths().folder + "/color"));
}

TEST_P(EarlierTest, RemovingAdoptsAndSaysSo) {
    PutLegacy(object(), "color", Ascii("blue"));
    PutLegacy(object(), "tags", Ascii("new"));
    ExpectNote(volume_.Remove("color"));
    EXPECT_THAT(Listed(volume_.List()), ElementsAre("tags"));
    EXPECT_FALSE(Exists(paths().folder + "/color"));
    EXPECT_TRUE(HoldingsOf(GetParam(), object()).HasAttribute({"tags", Ascii("new")}));
}

TEST_P(EarlierTest, ImportingAdoptsAndSaysSo) {
    PutLegacy(object(), "color", Ascii("blue"));
    WriteFile(volume_.path() + "/file", MacSidecar({{{"a", Ascii("1")}}, Pattern(32, 1)}).bytes);
    ExpectNote(volume_.Run({"import", volume_.path() + "/file", object()}));
    const Holdings found = HoldingsOf(GetParam(), object());
    EXPECT_TRUE(found.HasAttribute({"a", Ascii("1")}));
    EXPECT_TRUE(found.HasAttribute({"color", Ascii("blue")}));
    EXPECT_FALSE(Exists(paths().folder + "/color"));
}

TEST_P(EarlierTest, UpgradingAdoptsAndSaysSo) {
    PutLegacy(object(), "color", Ascii("blue"));
    const ToolResult result = volume_.Run({"upgrade", object()});
    EXPECT_EQ(0, result.status) << result.err;
    EXPECT_THAT(result.out, HasSubstr("1 converted, "));
    EXPECT_TRUE(Exists(volume_.stream()));
    EXPECT_FALSE(Exists(paths().folder));
}

// ---- What cannot be looked at -------------------------------------------------------------------

class UnreadableTest : public EarlierTest {
 protected:
    // Each way to look at the object fails, and names the path.
    void ExpectFailures(const std::string& path, const std::string& name, uid_t user = 0) const {
        const TempDir there(FastDirectory());
        WriteFile(there / "same", Ascii("data"));
        for (const Arguments& run : Runs{
                 {"list", object()},
                 {"list", "-l", object()},
                 {"--json", "list", object()},
                 {"list", "-r", volume_.path()},
                 {"show", object()},
                 {"get", object(), name},
             }) {
            SCOPED_TRACE(::testing::PrintToString(run));
            const ToolResult result = volume_.Run(run, {}, {.user = user});
            EXPECT_EQ(2, result.status);
            EXPECT_THAT(result.err, HasSubstr(path));
        }
        for (const Arguments& run : Runs{
                 {"convert", "--to", "0", object(), there / "converted"},
                 {"diff", object(), there / "same"},
             }) {
            SCOPED_TRACE(::testing::PrintToString(run));
            const ToolResult result = volume_.Run(run, {}, {.user = user});
            EXPECT_EQ(2, result.status);
            EXPECT_THAT(result.err, AnyOf(HasSubstr(path), HasSubstr(object())));
        }
        for (const Arguments& source : Runs{{object()}, {"-rT", volume_.path()}}) {
            const TempDir copies(FastDirectory());
            ASSERT_EQ(0, chmod(copies.path().c_str(), 0777));
            Arguments run = {"--volume", copies.path() + "=0", "cp"};
            run.insert(run.end(), source.begin(), source.end());
            run.push_back(copies.path());
            SCOPED_TRACE(::testing::PrintToString(run));
            const ToolResult result = volume_.Run(run, {}, {.user = user});
            // The data may come without its metadata, where that is no secret.
            EXPECT_EQ(Exists(copies / "file.txt") ? 2 : 1, result.status);
            EXPECT_THAT(result.err, AnyOf(HasSubstr(path), HasSubstr(object())));
        }
    }

    // Every file that might be in the way at a path, one after the other.
    void ForEachObstacle(const std::string& path, const Bytes& sound,
                         const std::function<void()>& then) const {
        fs::create_directory(path);
        then();
        fs::remove(path);
        ASSERT_EQ(0, mkfifo(path.c_str(), 0666));
        then();
        fs::remove(path);
        WriteFile(volume_.path() + "/elsewhere", sound);
        ASSERT_EQ(0, symlink((volume_.path() + "/elsewhere").c_str(), path.c_str()));
        then();
        fs::remove(path);
        ASSERT_EQ(0, symlink("nowhere", path.c_str()));
        then();
        fs::remove(path);
        for (const std::size_t size :
             {std::size_t{1}, std::size_t{25}, std::size_t{60}, sound.size() - 1}) {
            Bytes cut = sound;
            cut.resize(size);
            WriteFile(path, cut);
            SCOPED_TRACE(size);
            then();
        }
    }
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, UnreadableTest, ::testing::ValuesIn(Types({1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(UnreadableTest, AStreamThatIsNoneIsAFailure) {
    PutResource(object(), PlainAppleDouble(Pattern(32, 1), {}));  // which can be read
    ForEachObstacle(volume_.stream(), ColourStream(),
                    [this] { ExpectFailures(volume_.stream(), kForkName); });
}

TEST_P(UnreadableTest, AResourceFileThatIsNoneIsAFailure) {
    PutStream(object(), ColourStream());
    ForEachObstacle(volume_.resource(), PlainAppleDouble(Pattern(32, 1), Pattern(500)),
                    [this] { ExpectFailures(volume_.resource(), kForkName); });
}

TEST_P(UnreadableTest, AnEaDirectoryThatIsALinkIsAFailure) {
    PutStream(object(), ColourStream());
    fs::rename(paths().ea_directory, volume_.path() + "/elsewhere");
    ASSERT_EQ(0, symlink("elsewhere", paths().ea_directory.c_str()));
    ExpectFailures(paths().ea_directory, "user.colour");
}

TEST_P(UnreadableTest, AnEaDirectoryThatMayNotBeEnteredIsAFailure) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    PutStream(object(), ColourStream());
    ASSERT_EQ(0, chmod(paths().ea_directory.c_str(), 0700));
    ExpectFailures(paths().ea_directory, "user.colour", kStranger);
    for (const Arguments& run : Runs{{"where", object()}, {"clean", "-r", volume_.path()}}) {
        const ToolResult result = volume_.Run(run, {}, {.user = kStranger});
        EXPECT_EQ(2, result.status) << run[0];
        EXPECT_THAT(result.err, HasSubstr(paths().ea_directory));
    }
}

TEST_P(UnreadableTest, ALegacyFolderThatMayNotBeEnteredIsAFailure) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    PutLegacy(object(), "color", Ascii("blue"));
    ASSERT_EQ(0, chmod(paths().folder.c_str(), 0700));
    ExpectFailures(paths().folder, "color", kStranger);
}

TEST_P(UnreadableTest, AnAppleDoubleFileThatMayNotBeReadIsAFailure) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    PutAppleDouble(object(), ColourStream());
    ASSERT_EQ(0, chmod(paths().apple_double.c_str(), 0600));
    ExpectFailures(paths().apple_double, "user.colour", kStranger);
}

TEST_P(UnreadableTest, OneThatCannotBeLookedAtDoesNotHideTheOthers) {
    PutStream(object(), Hex("00 05 16 07"));
    const std::string sound = volume_.path() + "/sound";
    WriteFile(sound, {});
    PutStream(sound, ColourStream());
    const ToolResult result = volume_.Run({"list", object(), sound});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.out, HasSubstr("user.colour"));
    EXPECT_THAT(result.err, HasSubstr(volume_.stream()));
}

}  // namespace
}  // namespace mavoea::test

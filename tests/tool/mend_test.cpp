// mavoea check --repair: what each kind of finding becomes; what is replaced is kept, what could be
// read is still there, and what cannot be mended without loss is as it was.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <map>
#include <set>
#include <sstream>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/snapshot.h"
#include "tests/tool/habits.h"
#include "tests/tool/holdings.h"
#include "tests/tool/kills.h"
#include "tests/tool/stopped_tool.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

std::vector<nlohmann::json> JsonLines(const ToolResult& result) {
    std::vector<nlohmann::json> all;
    std::istringstream in(result.out);
    for (std::string line; std::getline(in, line);) all.push_back(nlohmann::json::parse(line));
    return all;
}

Attribute Blue() { return {"colour", Ascii("blue"), 7}; }
Attribute Size() { return {"size", Pattern(3000)}; }

StreamImage Image() {
    return {.attributes = {Blue(), {"empty", {}}, Size()}, .fork = Pattern(500, 3)};
}

class MendTest : public ::testing::Test {
 protected:
    void SetUp() override { MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path()); }

    std::string Add(const std::string& name) const {
        WriteFile(dir_ / name, Ascii("data of " + name));
        return dir_ / name;
    }
    ToolResult Run(Arguments arguments, Limits limits = {}) const {
        if (!type_.empty()) {
            arguments.insert(arguments.begin(), {"--volume", dir_.path() + "=" + type_});
        }
        return RunTool(arguments, {}, limits);
    }
    ToolResult Check() const { return Run({"check", "-r", dir_.path()}); }
    // Each is foreseen by a dry run, which changes nothing.
    ToolResult Repair(const Arguments& options = {}) const {
        Arguments arguments = {"check", "-r", "--repair"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        arguments.push_back(dir_.path());
        if (Tested().emulated()) return Run(arguments);  // where each run takes long
        Arguments dry = arguments;
        dry.insert(dry.begin() + 1, "--dry-run");
        const Snapshot before = TakeSnapshot(dir_.path());
        const ToolResult said = Run(dry);
        EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
        const ToolResult done = Run(arguments);
        EXPECT_EQ(done.out, WithoutCounts(said.out));
        EXPECT_EQ(done.err, said.err);
        EXPECT_EQ(done.status, said.status);
        return done;
    }
    // Which --verbose has as well, and JSON always.
    static std::string WithoutCounts(const std::string& text) {
        const std::size_t end = text.find_last_of('\n', text.size() - 2);
        const std::size_t last = end == std::string::npos ? 0 : end + 1;
        const bool counts = text.find(" checked, ", last) != std::string::npos;
        return counts && text[last] != '/' ? text.substr(0, last) : text;
    }
    // "KIND mended" or "KIND left", sorted, each once.
    std::set<std::string> Became(const Arguments& options = {}) const {
        Arguments all = {"--json"};
        all.insert(all.end(), options.begin(), options.end());
        std::set<std::string> became;
        for (const nlohmann::json& line : JsonLines(Repair(all))) {
            if (!line.contains("kind")) continue;
            const bool mended = line["mended"];
            EXPECT_EQ(mended, !line.contains("why")) << line;
            became.insert(line["kind"].get<std::string>() + (mended ? " mended" : " left"));
        }
        return became;
    }
    Holdings Held(const std::string& object) const {
        return HoldingsOf(type_ == "appledouble" ? 0 : 1, object);
    }

    const TempDir dir_;
    std::string type_ = "eadir";
};

// ---- Damage of which everything can be read ----------------------------------------------------

struct Damage {
    const char* name;
    std::function<void(Bytes*)> make;
};
void PrintTo(const Damage& damage, std::ostream* out) { *out << damage.name; }

// Damage to Image(): nothing that it holds has gone, and no two parts lie over each other.
std::vector<Damage> AllReadable() {
    const auto put = [](std::size_t at, std::uint64_t value) {
        return [=](Bytes* bytes) { PutU32(*bytes, at, value); };
    };
    const StreamImage image = Image();
    return {
        {"TotalSizeTooSmall", put(kTotalSizeAt, 130)},
        {"TotalSizeTooLarge", put(kTotalSizeAt, image.TotalSize() + 7)},
        {"TotalSizeBeyondTheEnd", put(kTotalSizeAt, 0x7FFFFFFF)},
        {"DataLengthTooSmall", put(kDataLengthAt, 3)},
        {"DataStartInTheTable", put(kDataStartAt, kTableAt + 4)},
        {"FinderInfoTooShortForTheArea", put(kFinderLengthAt, 60)},
        {"ValuesTheOtherWayAround",
         [image](Bytes* bytes) {  // the last first
             const std::size_t at = image.DataStart();
             const Bytes size = Size().value;
             std::copy(size.begin(), size.end(), bytes->begin() + static_cast<int>(at));
             const Bytes blue = Blue().value;
             std::copy(blue.begin(), blue.end(),
                       bytes->begin() + static_cast<int>(at + size.size()));
             PutU32(*bytes, image.RecordAt(0), at + size.size());
             PutU32(*bytes, image.RecordAt(2), at);
         }},
        {"ForkBehindAGap",
         [image](Bytes* bytes) {
             bytes->insert(bytes->begin() + image.TotalSize(), 10, 0);
             PutU32(*bytes, kForkOffsetAt, image.TotalSize() + 10);
         }},
    };
}

class ReadableDamageTest : public MendTest,
                           public ::testing::WithParamInterface<std::tuple<int, Damage>> {
 protected:
    static constexpr const char* kPlaces[] = {"stream", "directory", "long name", "appledouble"};

    std::string place() const { return kPlaces[std::get<0>(GetParam())]; }
    bool beside() const { return place() == "appledouble"; }
    std::string Make() const {
        if (place() == "long name") return Add(std::string(250, 'n'));
        if (place() != "directory") return Add("a");
        MakeDir(dir_ / "a");
        return dir_ / "a";
    }
    std::string File(const std::string& object) const {
        const MetadataPaths paths(object);
        return beside() ? paths.apple_double : paths.stream;
    }
    std::string Kept(const std::string& object) const {
        return beside() ? dir_ / ".mavoea-kept-._a"
                        : MetadataPaths(object).ea_directory + "/" +
                              ShortenedName(object.substr(dir_.path().size() + 1)) + "@MavoEAKept";
    }
};
INSTANTIATE_TEST_SUITE_P(All, ReadableDamageTest,
                         ::testing::Combine(::testing::Range(0, 4),
                                            ::testing::ValuesIn(AllReadable())),
                         [](const auto& tested) {
                             return std::get<1>(tested.param).name +
                                    std::to_string(std::get<0>(tested.param));
                         });

// Promise: "The tool: `check --repair` |"
TEST_P(ReadableDamageTest, TheFileIsWrittenAnewAndTheOldOneKeptUntilYes) {
    if (beside()) type_ = "appledouble";
    const std::string object = Make();
    Bytes damaged = Image().Build();
    std::get<1>(GetParam()).make(&damaged);
    if (beside()) {
        PutAppleDouble(object, damaged);
    } else {
        PutStream(object, damaged);
    }
    ASSERT_EQ(0, chmod(object.c_str(), 0750));
    ASSERT_EQ(0, chmod(File(object).c_str(), 0640));
    ASSERT_EQ(1, Check().status) << Check().out;
    const auto sound = [&] {
        const Holdings held = Held(object);
        EXPECT_EQ(3U, held.attributes.size());
        for (const Attribute& one : Image().attributes) {
            EXPECT_TRUE(held.HasAttribute(one)) << one.name;
        }
        EXPECT_TRUE(held.HasFork(Image().fork));
        EXPECT_EQ(0, Check().status) << Check().out;
        EXPECT_EQ("", Check().out);
        EXPECT_EQ(0640, ModeOf(File(object)));
    };
    const ToolResult repaired = Repair();
    EXPECT_EQ(0, repaired.status) << repaired.out << repaired.err;
    EXPECT_EQ("", repaired.err);
    EXPECT_THAT(repaired.out, HasSubstr("; mended; the old one is kept in " + Kept(object)));
    sound();
    EXPECT_EQ(damaged, BytesIn(Kept(object)));
    EXPECT_EQ(0640, ModeOf(Kept(object)));
    EXPECT_THAT(Check().err, HasSubstr(Kept(object) + ": what a repair has replaced"));
    // Again it has nothing to do.
    const Snapshot before = TakeSnapshot(dir_.path());
    EXPECT_EQ(0, Repair().status);
    EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
    EXPECT_EQ(0, Repair({"--yes"}).status);
    EXPECT_FALSE(Exists(Kept(object)));
    sound();
    EXPECT_THAT(Check(), Succeeded());
}

TEST_F(MendTest, YesMendsAndRemovesInOneGo) {
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    PutStream(Add("a"), damaged);
    EXPECT_EQ(0, Repair({"--yes"}).status);
    EXPECT_THAT(NamesIn(dir_ / "@eaDir"), ElementsAre("a@MavoEAStream"));
    EXPECT_TRUE(Held(dir_ / "a").HasAttribute(Size()));
    EXPECT_THAT(Check(), Succeeded());
}

TEST_F(MendTest, AResourceFileIsWrittenAnewWithItsRecord) {
    const Bytes finder = Pattern(32, 9);
    const Bytes comment = Ascii("a comment");
    const std::string object = Add("a");
    PutResource(object, ResourceFileOf({{kFinderInfoEntry, finder},
                                        {kCommentEntry, comment},
                                        {kDatesEntry, Repeat(0, 16)},
                                        {kForkEntry, Pattern(300)}}));
    Bytes bytes = BytesIn(MetadataPaths(object).resource);
    for (std::size_t at = 26; at < 26 + std::size_t{12} * U16At(bytes, kDescriptorCountAt);
         at += 12) {
        // One that says nothing becomes the Finder info a second time.
        if (U32At(bytes, at) != kDatesEntry) continue;
        const Bytes twice = Hex("00 00 00 09") + Bytes(8);
        std::copy(twice.begin(), twice.end(), bytes.begin() + static_cast<int>(at));
        for (std::size_t from = 26; from < at; from += 12) {
            if (U32At(bytes, from) != kFinderInfoEntry) continue;
            PutU32(bytes, at + 4, U32At(bytes, from + 4));
            PutU32(bytes, at + 8, U32At(bytes, from + 8));
        }
    }
    WriteFile(MetadataPaths(object).resource, bytes);
    ASSERT_THAT(Check().out, HasSubstr("damaged-resource-file"));
    EXPECT_EQ(0, Repair().status) << Repair().out;
    const Holdings held = Held(object);
    EXPECT_TRUE(held.HasFinderInfo(finder));
    EXPECT_TRUE(held.HasEntry(kCommentEntry, comment));
    EXPECT_TRUE(held.HasFork(Pattern(300)));
    EXPECT_EQ(bytes, BytesIn(MetadataPaths(object).OfKind("MavoResKept")));
    EXPECT_EQ("", Check().out);
}

// Who has written a "._" file counts for Samba, and stays.
TEST_F(MendTest, AFileBesideAnObjectOfSambasIsWrittenAnewInItsWay) {
    const Bytes filler = Ascii("Netatalk        ");
    for (const char* type : {"samba", "netatalk"}) {
        SCOPED_TRACE(type);
        type_ = type;
        const std::string object = Add(type);
        Bytes damaged =
            StreamImage{.attributes = {Blue()}, .fork = Ascii("fork"), .filler = filler}.Build();
        PutU32(damaged, kTotalSizeAt, 130);
        PutAppleDouble(object, damaged);
        const std::string file = dir_ / ("._" + std::string(type));
        EXPECT_EQ(0, Run({"check", "--repair", object}).status)
            << Run({"check", "--repair", object}).out;
        EXPECT_EQ("", Run({"check", object}).out);
        const Bytes mended = BytesIn(file);
        EXPECT_EQ(filler, Bytes(mended.begin() + 8, mended.begin() + 24));
        EXPECT_EQ("fork", Run({"get", object, kForkName}).out);
        EXPECT_EQ(damaged, BytesIn(dir_ / (".mavoea-kept-._" + std::string(type))));
    }
}

TEST_F(MendTest, AFullDiskLeavesEverythingAsItWas) {
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    PutStream(Add("a"), damaged);
    PutLegacy(Add("b"), "large", Pattern(20000));
    PutStream(dir_ / "b", Image().Build());
    const Snapshot before = TakeSnapshot(dir_.path());
    const ToolResult result =
        Run({"check", "-r", "--repair", "--yes", dir_.path()}, {.file_size = 2000});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.out, HasSubstr("; left: "));
    EXPECT_THAT(
        Differences(before, TakeSnapshot(dir_.path()), {"mtime of directories", "mtime", "ctime"}),
        IsEmpty());
}

TEST_F(MendTest, WhoeverOwnsTheObjectsMayRepairThem) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    PutStream(Add("a"), damaged);
    PutStream(Add("other"), Image().Build());
    ASSERT_EQ(0, RunProgram("chown -R 54321:54321 " + Quoted(dir_.path())).status);
    // Given away by nobody but the superuser.
    ASSERT_EQ(0, chown((dir_ / "@eaDir/other@MavoEAStream").c_str(), 0, 54321));
    const ToolResult result =
        Run({"check", "-r", "--repair", "--yes", dir_.path()}, {.user = 54321});
    EXPECT_THAT(result.out, HasSubstr("; mended; the old one is kept in "));
    EXPECT_THAT(result.out, HasSubstr("; left: only the superuser may give it"));
    EXPECT_THAT(NamesIn(dir_ / "@eaDir"), ElementsAre("a@MavoEAStream", "other@MavoEAStream"));
    EXPECT_TRUE(Held(dir_ / "a").HasAttribute(Size()));
}

// ---- Damage of which something has gone ---------------------------------------------------------

// A stream cut at each length, and each field of its header with other values: what is changed is
// kept as it was and has all that was in it; all else is as it was.
TEST_F(MendTest, NothingIsLostWhateverIsDamaged) {
    const StreamImage image = {.attributes = {Blue(), {"size", Pattern(40)}},
                               .fork = Pattern(30, 3)};
    const Bytes sound = image.Build();
    std::vector<Bytes> damaged;
    for (std::size_t size = 0; size < sound.size(); ++size) {
        damaged.emplace_back(sound.begin(), sound.begin() + static_cast<int>(size));
    }
    std::vector<std::size_t> fields = {0, 4};
    for (std::size_t at = kFinderIdAt; at < kFinderInfoAt; at += 4) fields.push_back(at);
    for (std::size_t at = kAttributeMagicAt; at < image.DataStart(); at += 4) fields.push_back(at);
    for (const std::size_t at : fields) {
        const std::uint32_t is = U32At(sound, at);
        for (const std::uint32_t value :
             {is + 1, is - 1, is + 16, is - 16, 0U, 0xFFFFFFFFU, std::uint32_t{1} << 16}) {
            Bytes one = sound;
            PutU32(one, at, value);
            if (one != sound) damaged.push_back(one);
        }
    }
    MakeDir(dir_ / "@eaDir");
    std::vector<std::string> names;
    for (const Bytes& bytes : Thinned(damaged, SeriesStep())) {
        names.push_back("n" + std::to_string(names.size()));
        PutStream(Add(names.back()), bytes);
    }
    const ToolResult result = Repair();
    EXPECT_NE(0, result.status);
    std::size_t mended = 0;
    for (std::size_t i = 0; i < names.size(); ++i) {
        SCOPED_TRACE(names[i]);
        const MetadataPaths paths(dir_ / names[i]);
        const Bytes old = Thinned(damaged, SeriesStep())[i];
        if (BytesIn(paths.stream) == old) {
            EXPECT_FALSE(Exists(paths.OfKind("MavoEAKept")));
            continue;
        }
        ++mended;
        EXPECT_EQ(old, BytesIn(paths.OfKind("MavoEAKept")));
        const Holdings held = Held(dir_ / names[i]);
        // Names, ranges and flags that were changed count as they are; but each range has its
        // bytes.
        EXPECT_EQ(2U, held.attributes.size());
        for (const auto& [name, attribute] : held.attributes) {
            EXPECT_NE(old.end(), std::search(old.begin(), old.end(), attribute.value.begin(),
                                             attribute.value.end()));
        }
        EXPECT_EQ(0, Run({"check", dir_ / names[i]}).status);
    }
    EXPECT_LT(10U / SeriesStep(), mended);
    EXPECT_LT(mended, names.size() / 2);
}

TEST_F(MendTest, WhatIsCutIsLeftAndSaidWithWhatCanBeRead) {
    Bytes cut = Image().Build();
    cut.resize(cut.size() - 100);
    PutStream(Add("a"), cut);
    const ToolResult result = Repair();
    EXPECT_EQ(1, result.status);
    EXPECT_EQ("", result.err);
    EXPECT_THAT(result.out, HasSubstr("; left: its resource fork passes its end; mavoea salvage "
                                      "writes out what can be read: \"colour\", \"empty\", "
                                      "\"size\", resource fork (400 of 500 bytes)\n"));
    EXPECT_EQ(cut, BytesIn(dir_ / "@eaDir/a@MavoEAStream"));
    EXPECT_THAT(NamesIn(dir_ / "@eaDir"), ElementsAre("a@MavoEAStream"));
    const nlohmann::json line = JsonLines(Repair({"--json"})).front();
    EXPECT_EQ(false, line["mended"]);
    EXPECT_EQ("its resource fork passes its end", line["why"]);
    EXPECT_THAT(line["readable"].get<std::string>(), HasSubstr("400 of 500"));
    EXPECT_FALSE(line.contains("kept"));
}

TEST_F(MendTest, PartsThatLieOverEachOtherAreLeft) {
    const StreamImage image = Image();
    Bytes shared = image.Build();
    PutU32(shared, image.RecordAt(0), image.ValueAt(2) + 1);
    PutStream(Add("values"), shared);
    Bytes over = image.Build();
    PutU32(over, kForkOffsetAt, image.TotalSize() - 1);
    PutStream(Add("fork"), over);
    Bytes twice = StreamImage{.attributes = {{"a", Ascii("1")}, {"a", Ascii("2")}}}.Build();
    PutStream(Add("twice"), twice);
    Bytes nobodys = image.Build();
    PutU16(nobodys, kAttributeCountAt, 2);
    PutStream(Add("nobodys"), nobodys);
    const ToolResult result = Repair();
    EXPECT_EQ(1, result.status);
    EXPECT_EQ(nobodys, BytesIn(dir_ / "@eaDir/nobodys@MavoEAStream"));
    EXPECT_THAT(result.out, HasSubstr("that belongs to no part of it"));
    EXPECT_THAT(result.out, AllOf(HasSubstr("its attribute \"colour\" lies over its attribute "
                                            "\"size\""),
                                  HasSubstr("its resource fork lies over its attribute \"size\""),
                                  HasSubstr("its attribute \"a\" is there twice")));
    EXPECT_EQ(shared, BytesIn(dir_ / "@eaDir/values@MavoEAStream"));
    EXPECT_EQ(over, BytesIn(dir_ / "@eaDir/fork@MavoEAStream"));
    EXPECT_EQ(twice, BytesIn(dir_ / "@eaDir/twice@MavoEAStream"));
}

// ---- What else is mended ------------------------------------------------------------------------

TEST_F(MendTest, RightsAreThoseOfTheObject) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS(dir_.path());
    const std::string acl = "system.posix_acl_access";
    // user: rw-; user 2: r--; group: r--; mask: r--; others: none.
    const Bytes list =
        Hex("02 00 00 00  01 00 06 00 FF FF FF FF  02 00 04 00 02 00 00 00"
            "04 00 04 00 FF FF FF FF  10 00 04 00 FF FF FF FF  20 00 00 00 FF FF FF FF");
    for (const char* name : {"mode", "owner", "group", "acl", "object"}) {
        ASSERT_EQ(0, chmod(Add(name).c_str(), 0640));
        PutStream(dir_ / name, Image().Build());
        ASSERT_EQ(0, chmod((dir_ / "@eaDir/" + name + "@MavoEAStream").c_str(), 0640));
    }
    const auto stream = [&](const std::string& name) {
        return dir_ / "@eaDir/" + name + "@MavoEAStream";
    };
    ASSERT_EQ(0, chmod(stream("mode").c_str(), 0666));
    ASSERT_EQ(0, chown(stream("owner").c_str(), 4321, 0));
    ASSERT_EQ(0, chmod(stream("owner").c_str(), 0644));
    ASSERT_EQ(0, chown(stream("group").c_str(), 0, 4321));
    SetFileAttribute(stream("acl"), acl, list);
    SetFileAttribute(dir_ / "object", acl, list);
    EXPECT_EQ((std::set<std::string>{"other-rights mended"}), Became());
    EXPECT_EQ(0640, ModeOf(stream("mode")));
    EXPECT_EQ(Bytes(), FileAttribute(stream("acl"), acl));
    EXPECT_EQ(list, FileAttribute(stream("object"), acl));
    EXPECT_THAT(Check(), Succeeded());
}

TEST_F(MendTest, WhatAThirdUserHasKeptToHimselfIsNotGivenAway) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS(dir_.path());
    PutStream(Add("private"), Image().Build());
    PutStream(Add("text"), Ascii("no stream, but a secret"));
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    PutStream(Add("perhaps"), damaged);
    for (const char* name : {"private", "text", "perhaps"}) {
        const std::string file = dir_ / "@eaDir/" + name + "@MavoEAStream";
        ASSERT_EQ(0, lchown((dir_ / name).c_str(), 1111, 1111));
        ASSERT_EQ(0, chown(file.c_str(), 2222, 2222));
        ASSERT_EQ(0, chmod(file.c_str(), name[0] == 'p' ? 0600 : 0644));
    }
    const Snapshot before = TakeSnapshot(dir_.path());
    EXPECT_EQ((std::set<std::string>{"other-rights left", "damaged-stream left"}), Became());
    EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
}

TEST_F(MendTest, WhatRunsHaveLeftIsBroughtToItsEnd) {
    const std::string object = Add("a");
    PutResource(object, ClassicFile(Pattern(32), {}).bytes);
    Add(".mavoea-0123abcd");
    WriteFile(dir_ / "@eaDir/.mavoea-0123abcd", {});
    MakeDir(dir_ / ".mavoea-12345-0123456789abcdef");
    PutKind(object, "MavoResourceTmp", ClassicFile(Pattern(32), {}).bytes);
    MakeDir(dir_ / "sub");
    MakeDir(dir_ / "sub/@eaDir");
    EXPECT_EQ((std::set<std::string>{"left-temporary-file mended", "unfinished-rename mended",
                                     "unfinished-repair left", "empty-ea-directory mended"}),
              Became());
    EXPECT_EQ((std::set<std::string>{"unfinished-repair mended"}), Became({"--yes"}));
    EXPECT_THAT(Check(), Succeeded());
    EXPECT_EQ((std::vector<std::string>{"@eaDir/", "@eaDir/a@MavoResource", "a", "sub/"}),
              Tree(dir_.path()));
}

TEST_F(MendTest, EarlierLayoutsAndMisplacedAttributesArePutRight) {
    const std::string legacy = Add("legacy");
    PutLegacy(legacy, "colour", Ascii("blue"));
    const std::string misplaced = Add("misplaced");
    const Bytes resource = Image().Build();
    PutResource(misplaced, resource);
    PutStream(misplaced, StreamImage{.attributes = {{"own", Ascii("1")}}}.Build());
    const Bytes stream = BytesIn(MetadataPaths(misplaced).stream);
    EXPECT_EQ((std::set<std::string>{"earlier-layout mended", "misplaced-attributes mended"}),
              Became());
    EXPECT_EQ(resource, BytesIn(MetadataPaths(misplaced).OfKind("MavoResKept")));
    EXPECT_EQ(stream, BytesIn(MetadataPaths(misplaced).OfKind("MavoEAKept")));
    const auto sound = [&] {
        EXPECT_EQ("", Check().out);
        const Holdings held = Held(misplaced);
        for (const Attribute& one : Image().attributes) EXPECT_TRUE(held.HasAttribute(one));
        EXPECT_TRUE(held.HasAttribute({"own", Ascii("1")}));
        EXPECT_TRUE(held.HasFork(Image().fork));
        EXPECT_TRUE(Held(legacy).HasAttribute({"colour", Ascii("blue")}));
    };
    sound();
    EXPECT_EQ(0, Repair({"--yes"}).status);
    sound();
    EXPECT_THAT(Check(), Succeeded());
}

TEST_F(MendTest, WhatNobodyReadsIsPutInItsPlaceAndGoesWithYes) {
    const std::string object = Add("a");
    PutStream(object, Image().Build());
    PutLegacy(object, "colour", Ascii("blue"));
    PutLegacy(object, "weight", Ascii("heavy"));
    PutAppleDouble(object, StreamImage{.attributes = {{"taste", Ascii("sour")}}}.Build());
    EXPECT_EQ((std::set<std::string>{"misplaced-metadata left", "stranded-metadata left"}),
              Became());
    const auto whole = [&] {
        const Holdings held = Held(object);
        for (const Attribute& one : Image().attributes) EXPECT_TRUE(held.HasAttribute(one));
        EXPECT_TRUE(held.HasAttribute({"weight", Ascii("heavy")}));
        EXPECT_TRUE(held.HasAttribute({"taste", Ascii("sour")}));
        EXPECT_TRUE(held.HasFork(Image().fork));
    };
    whole();
    EXPECT_TRUE(Exists(dir_ / "@eaDir/a/weight"));
    EXPECT_TRUE(Exists(dir_ / "._a"));
    EXPECT_EQ((std::set<std::string>{"misplaced-metadata mended", "stranded-metadata mended"}),
              Became({"--yes"}));
    whole();
    EXPECT_FALSE(Exists(dir_ / "._a"));
    EXPECT_FALSE(Exists(dir_ / "@eaDir/a"));
    EXPECT_THAT(Check(), Succeeded());
}

// Where they are files like others, they may be come by after they have gone into their objects.
TEST_F(MendTest, SidecarsThatAreObjectsThemselvesAreNotMissedAfterwards) {
    type_ = "linux";
    const auto add_sidecar = [&](const std::string& name) {
        PutAppleDouble(dir_ / name, StreamImage{.attributes = {{"colour", Ascii("blue")}}}.Build());
    };
    add_sidecar("before");
    for (const char* name : {"before", "behind"}) Add(name);
    add_sidecar("behind");
    EXPECT_EQ((std::set<std::string>{"misplaced-metadata mended"}), Became({"--yes"}));
    EXPECT_THAT(Check(), Succeeded());
    for (const char* name : {"before", "behind"}) {
        EXPECT_EQ("blue", Run({"get", dir_ / name, "colour"}).out) << name;
    }
}

TEST_F(MendTest, AnEaDirectorysFilesOfAnAppleDoubleVolumeGoIntoItsOwn) {
    type_ = "appledouble";
    const std::string object = Add("a");
    PutStream(object, Image().Build());
    PutResource(object, ClassicFile(Pattern(32, 9), Image().fork).bytes);
    EXPECT_EQ((std::set<std::string>{"misplaced-metadata mended"}), Became({"--yes"}));
    const Holdings held = Held(object);
    for (const Attribute& one : Image().attributes) EXPECT_TRUE(held.HasAttribute(one));
    EXPECT_TRUE(held.HasFork(Image().fork));
    EXPECT_TRUE(held.HasFinderInfo(Pattern(32, 9)));
    EXPECT_THAT(Check(), Succeeded());
}

TEST_F(MendTest, WhatHasAnotherValueInItsPlaceIsLeft) {
    const std::string object = Add("a");
    PutStream(object, Image().Build());
    PutLegacy(object, "colour", Ascii("red"));
    const Snapshot before = TakeSnapshot(dir_.path());
    const ToolResult result = Repair({"--yes"});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.out, HasSubstr("; left: its \"colour\" is another one than the object has"));
    EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
}

TEST_F(MendTest, AStreamOfSambasGetsItsNul) {
    type_ = "samba";
    const std::string name = "user.DosStream.colour:$DATA";
    SetFileAttribute(Add("a"), name, Ascii("blue"));
    SetFileAttribute(Add("parts"), name, Ascii("blue") + Bytes{2});
    const ToolResult result = Repair();
    EXPECT_EQ(1, result.status) << result.out;
    EXPECT_EQ(Ascii("blue") + Bytes{0}, FileAttribute(dir_ / "a", name));
    EXPECT_EQ(Ascii("blue") + Bytes{2}, FileAttribute(dir_ / "parts", name));
    EXPECT_THAT(result.out, HasSubstr("its last byte may be the number of its parts"));
}

TEST_F(MendTest, WhatMacsIgnoreIsWrittenAnew) {
    type_ = "appledouble";
    Bytes file = StreamImage{.attributes = {Blue()}}.Build();
    PutU32(file, kDataStartAt, 100);
    PutAppleDouble(Add("a"), file);
    ASSERT_THAT(Check().out, HasSubstr("mac-ignores-file"));
    EXPECT_EQ(0, Repair().status);
    EXPECT_EQ("", Check().out);
    EXPECT_TRUE(Held(dir_ / "a").HasAttribute(Blue()));
    EXPECT_EQ(file, BytesIn(dir_ / ".mavoea-kept-._a"));
}

TEST_F(MendTest, WhatSmbdIgnoresIsWrittenAnewIfThatHelps) {
    type_ = "samba";
    const Bytes three = PlainAppleDouble(Pattern(32), Ascii("fork"), 3);  // the third is empty
    PutAppleDouble(Add("three"), three);
    const Bytes comment = AppleDoubleOf(
        {{kFinderInfoEntry, Pattern(32)}, {kCommentEntry, Ascii("a")}, {kForkEntry, Ascii("f")}});
    PutAppleDouble(Add("comment"), comment);
    const Bytes large = StreamImage{.attributes = {{"a", Pattern(65536)}}}.Build();
    PutAppleDouble(Add("large"), large);
    EXPECT_EQ((std::set<std::string>{"smbd-ignores-file mended", "smbd-ignores-file left"}),
              Became());
    EXPECT_EQ("", Run({"check", dir_ / "three"}).out);
    EXPECT_EQ("fork", Run({"get", dir_ / "three", kForkName}).out);
    EXPECT_EQ(three, BytesIn(dir_ / ".mavoea-kept-._three"));
    EXPECT_EQ(comment, BytesIn(dir_ / "._comment"));
    EXPECT_EQ(large, BytesIn(dir_ / "._large"));
    EXPECT_FALSE(Exists(dir_ / ".mavoea-kept-._large"));
    EXPECT_THAT(Repair().out,
                HasSubstr("; left: a new one would be ignored as well: its attributes "
                          "take "));
}

// ---- Every kind ---------------------------------------------------------------------------------

// What only a person can decide is said, and is as it was.
TEST_F(MendTest, WhatIsNotMendedIsLeftAsItWas) {
    MakeDir(dir_ / "@eaDir");
    ASSERT_EQ(0, symlink("/etc/passwd", (dir_ / "@eaDir/link@MavoEAStream").c_str()));
    Add("link");
    PutStream(dir_ / "gone", Image().Build());
    PutKind(dir_ / "gone", "Thumbnail", Ascii("x"));
    const std::string head(241, 'n');
    Add(head + "abcdefghi");
    Add(head + "ihgfedcba");
    Add(".mavoea-moving-0123456789ABCDEF");
    PutStream(Add("text"), Ascii("not a stream at all"));
    const Snapshot before = TakeSnapshot(dir_.path());
    for (const Arguments& options : {Arguments{}, Arguments{"--yes"}}) {
        EXPECT_EQ((std::set<std::string>{"dangling-metadata left", "dangling-service-file left",
                                         "no-file left", "shared-names left",
                                         "unfinished-move left", "damaged-stream left"}),
                  Became(options));
        EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
    }
}

TEST_F(MendTest, WhatOtherProgramsKeepIsLeftAsItWas) {
    type_ = "samba";
    SetFileAttribute(Add("cut"), "user.DosStream.AFP_AfpInfo:$DATA", Repeat(0, 30));
    Bytes record = AttributeRecord();
    PutU16(record, 24, 7);
    SetFileAttribute(Add("record"), "user.org.netatalk.Metadata", record);
    Bytes mac = PlainAppleDouble(Pattern(32), Ascii("fork"));
    const Bytes filler = Ascii("Mac OS X        ");
    std::copy(filler.begin(), filler.end(), mac.begin() + 8);
    PutAppleDouble(Add("mac"), mac);
    const Snapshot before = TakeSnapshot(dir_.path());
    EXPECT_EQ(
        (std::set<std::string>{"damaged-attribute left", "damaged-record left",
                               "smbd-overrides-finder-info left", "smbd-refuses-record left"}),
        Became({"--yes"}));
    EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
}

TEST_F(MendTest, WhatDiffersOrIsUndeclaredIsLeftAsItWas) {
    type_ = "fileea";
    const std::string object = Add("a");
    SetFileAttribute(object, "user.netatalk.Metadata", RecordOf({.finder_info = Pattern(32, 1)}));
    PutResource(object, ClassicFile(Pattern(32, 2), {}).bytes);
    Snapshot before = TakeSnapshot(dir_.path());
    EXPECT_EQ((std::set<std::string>{"differing-values left"}), Became({"--yes"}));
    EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());

    const TempDir other;
    WriteFile(other / "b", Ascii("data"));
    SetFileAttribute(other / "b", "user.DosStream.colour:$DATA", Ascii("blue") + Bytes{0});
    before = TakeSnapshot(other.path());
    const ToolResult result = RunTool({"check", "-r", "--repair", "--yes", other.path()});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.out, AllOf(HasSubstr(": undeclared-metadata: "),
                                  HasSubstr("; left: declare the type of the volume\n")));
    EXPECT_THAT(Differences(before, TakeSnapshot(other.path())), IsEmpty());
}

TEST_F(MendTest, EveryKindSaysInTheHelpAndTheManualHowItIsMended) {
    const std::string help = RunTool({"check", "--help"}).out;
    const std::size_t at = help.find("With --repair:\n");
    const std::size_t kinds = help.find("Their kinds:\n");
    ASSERT_NE(std::string::npos, at);
    ASSERT_LT(at, kinds);
    const Bytes bytes = BytesIn(MAVOEA_CHECKING_MANUAL);
    const std::string manual(bytes.begin(), bytes.end());
    std::istringstream lines(help.substr(kinds));
    int count = 0;
    for (std::string line; std::getline(lines, line);) {
        if (!line.starts_with("  ")) continue;
        ++count;
        const std::string code = line.substr(2, line.find(' ', 2) - 1);
        const std::size_t mending = help.find("  " + code, at);
        ASSERT_LT(mending, kinds) << code;
        const std::string how =
            help.substr(mending, help.find('\n', mending) - mending).substr(line.find(' ', 2));
        const std::size_t row = manual.find("\n| `" + code.substr(0, code.size() - 1) + "` |");
        ASSERT_NE(std::string::npos, row) << code;
        const std::string cells = manual.substr(row + 1, manual.find('\n', row + 1) - row - 1);
        EXPECT_THAT(cells, EndsWith(" | " + how.substr(how.find_first_not_of(' ')) + " |"));
    }
    EXPECT_EQ(26, count);
}

// All that can be mended in one tree; what the tool reads of it is the same before and behind.
TEST_F(MendTest, AWholeTreeIsSoundAfterwardsAndHasAllThatCouldBeRead) {
    MakeDir(dir_ / "sub");
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    for (const char* name : {"stream", "sub/stream", "both"}) PutStream(Add(name), damaged);
    PutStream(dir_ / "sub", damaged);
    for (const char* name : {"resource", "both"}) {
        Add(name);
        Bytes other = StreamImage{.attributes = {{"weight", Ascii("1")}},
                                  .fork = Image().fork,
                                  .finder_info = Pattern(32, 9)}
                          .Build();
        PutU32(other, kDataLengthAt, 3);
        PutResource(dir_ / name, other);
    }
    PutLegacy(Add("legacy"), "colour", Ascii("blue"));
    PutAppleDouble(Add("mac"), MacSidecar({{{"a", Ascii("1")}}, Pattern(32), {}}).bytes);
    PutStream(Add("stranded"), Image().Build());
    PutLegacy(dir_ / "stranded", "colour", Ascii("blue"));
    PutStream(Add("misplaced"), Image().Build());
    PutAppleDouble(dir_ / "misplaced", Image().Build());
    PutStream(Add("rights"), Image().Build());
    ASSERT_EQ(0, chmod((dir_ / "@eaDir/rights@MavoEAStream").c_str(), 0606));
    Add(".mavoea-0123abcd");
    const auto values = [&] {
        std::map<std::string, std::string> all;  // by path and name
        for (const nlohmann::json& line :
             JsonLines(Run({"--json", "list", "-r", "--values", dir_.path()}))) {
            if (!line.contains("attributes")) continue;
            for (const nlohmann::json& one : line["attributes"]) {
                all[line["path"].get<std::string>() + ' ' + one["name"].get<std::string>()] =
                    one.at("base64").dump();
            }
        }
        return all;
    };
    const auto before = values();
    EXPECT_LT(30U, before.size());
    EXPECT_EQ((std::set<std::string>{"damaged-stream mended", "damaged-resource-file mended",
                                     "misplaced-attributes mended", "earlier-layout mended",
                                     "stranded-metadata mended", "misplaced-metadata mended",
                                     "other-rights mended", "left-temporary-file mended"}),
              Became({"--yes"}));
    EXPECT_THAT(Check(), Succeeded());
    EXPECT_EQ(before, values());
}

// ---- What is kept -------------------------------------------------------------------------------

class KeptTest : public MendTest {
 protected:
    void SetUp() override {
        MendTest::SetUp();
        damaged_ = Image().Build();
        PutU32(damaged_, kTotalSizeAt, 130);
        PutStream(Add("a"), damaged_);
        ASSERT_EQ(0, Repair().status);
        ASSERT_EQ(damaged_, BytesIn(kept()));
    }
    std::string kept() const { return dir_ / "@eaDir/a@MavoEAKept"; }

    Bytes damaged_;
};

TEST_F(KeptTest, StaysWhileTheObjectHasSomethingElse) {
    ASSERT_EQ(0, Run({"set", dir_ / "a", "colour", "green"}).status);
    const ToolResult result = Repair({"--yes"});
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.err, HasSubstr(kept() + ": kept: the object has something else by now: "
                                               "\"colour\""));
    EXPECT_EQ(damaged_, BytesIn(kept()));
    ASSERT_EQ(0, Run({"set", dir_ / "a", "colour", "blue"}).status);
    EXPECT_EQ(0, Repair({"--yes"}).status);
    EXPECT_FALSE(Exists(kept()));
}

TEST_F(KeptTest, StaysWhileTheNewOneIsDamaged) {
    Bytes cut = Image().Build();
    cut.resize(cut.size() - 1);
    WriteFile(dir_ / "@eaDir/a@MavoEAStream", cut);
    EXPECT_EQ(1, Repair({"--yes"}).status);
    EXPECT_EQ(damaged_, BytesIn(kept()));
    ASSERT_EQ(0, unlink((dir_ / "@eaDir/a@MavoEAStream").c_str()));
    EXPECT_EQ(1, Repair({"--yes"}).status);
    EXPECT_EQ(damaged_, BytesIn(kept()));
}

TEST_F(KeptTest, IsNotWrittenOverByAnotherRepair) {
    Bytes other = Image().Build();
    PutU32(other, kDataLengthAt, 3);
    WriteFile(dir_ / "@eaDir/a@MavoEAStream", other);
    const ToolResult result = Repair();
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.out, HasSubstr("; left: what an earlier repair has replaced is kept there"));
    EXPECT_EQ(damaged_, BytesIn(kept()));
    EXPECT_EQ(other, BytesIn(dir_ / "@eaDir/a@MavoEAStream"));
}

TEST_F(KeptTest, GoesWhereTheObjectGoes) {
    ASSERT_THAT(Run({"mv", dir_ / "a", dir_ / "b"}), Succeeded());
    EXPECT_EQ(damaged_, BytesIn(dir_ / "@eaDir/b@MavoEAKept"));
    EXPECT_EQ(0, Repair({"--yes"}).status);
    EXPECT_THAT(NamesIn(dir_ / "@eaDir"), ElementsAre("b@MavoEAStream"));
    ASSERT_THAT(Run({"rm", dir_ / "b"}), Succeeded());
    EXPECT_FALSE(Exists(dir_ / "@eaDir"));
}

TEST_F(MendTest, WhatIsKeptBesideAnAppleDoubleFileIsNoObject) {
    type_ = "appledouble";
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    const std::string long_name(252, 'n');
    for (const std::string& name : {std::string("a"), long_name}) {
        PutAppleDouble(Add(name), damaged);
    }
    ASSERT_EQ(0, Repair().status);
    EXPECT_EQ("", Check().out);
    EXPECT_EQ("", Run({"clean", "-r", "--yes", "--wait", "0", dir_.path()}).err);
    EXPECT_EQ(damaged, BytesIn(dir_ / ".mavoea-kept-._a"));
    ASSERT_EQ(0, unlink((dir_ / "a").c_str()));
    ASSERT_EQ(0, unlink((dir_ / "._a").c_str()));
    const ToolResult result = Repair({"--yes"});
    EXPECT_EQ(0, result.status) << result.out;
    EXPECT_THAT(result.err, HasSubstr(".mavoea-kept-._a: what a repair has replaced, of an object "
                                      "that is gone"));
    EXPECT_EQ((std::vector<std::string>{"._" + long_name, ".mavoea-kept-._a", long_name}),
              Tree(dir_.path()));
}

// ---- Others at work -----------------------------------------------------------------------------

TEST_F(MendTest, WhatAServiceHasLockedIsLeftAlone) {
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    PutStream(Add("a"), damaged);
    {
        const HeldLock lock(dir_ / "@eaDir/a@MavoEAStream");
        for (const char* const option : {"--dry-run", "--repair"}) {
            const ToolResult result = Run({"check", "-r", "--repair", option, dir_.path()});
            EXPECT_EQ(0, result.status);
            EXPECT_EQ("", WithoutCounts(result.out));
            EXPECT_THAT(result.err, HasSubstr("in use by another process: not looked into"));
        }
    }
    EXPECT_EQ(damaged, BytesIn(dir_ / "@eaDir/a@MavoEAStream"));
    EXPECT_THAT(NamesIn(dir_ / "@eaDir"), ElementsAre("a@MavoEAStream"));
}

TEST_F(MendTest, ADryRunIsOneOfARepairAndHasNoLog) {
    const ToolResult alone = Run({"check", "--dry-run", dir_.path()});
    EXPECT_EQ(2, alone.status);
    EXPECT_THAT(alone.err, HasSubstr("--dry-run requires --repair"));
    const ToolResult logged =
        Run({"check", "--repair", "--dry-run", "--log", dir_ / "log", dir_.path()});
    EXPECT_EQ(2, logged.status);
    EXPECT_THAT(logged.err, HasSubstr("--dry-run excludes --log"));
}

TEST_F(MendTest, ADryRunForeseesWhatAnotherUserMayNotMend) {
    MAVOEA_SKIP_UNLESS_ROOT();
    chmod(dir_.path().c_str(), 0755);
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    PutStream(Add("a"), damaged);
    chmod((dir_ / "a").c_str(), 0666);
    chmod((dir_ / "@eaDir").c_str(), 0755);
    chmod((dir_ / "@eaDir/a@MavoEAStream").c_str(), 0666);
    const Arguments words = {"check", "-r", "--repair", dir_.path()};
    Arguments dry = words;
    dry.emplace_back("--dry-run");
    const ToolResult said = Run(dry, {.user = 54321});
    const ToolResult done = Run(words, {.user = 54321});
    EXPECT_EQ(1, done.status);
    EXPECT_THAT(done.out, HasSubstr("; left: Permission denied"));
    EXPECT_EQ(done.status, said.status);
    EXPECT_EQ(done.out, WithoutCounts(said.out));
    EXPECT_EQ(done.err, said.err);
}

TEST_F(MendTest, FilesOfSeveralNamesAndLinksAreLeftAlone) {
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    const TempDir outside;
    WriteFile(outside / "secret", damaged);
    WriteFile(outside / "rights", Image().Build());
    ASSERT_EQ(0, chmod((outside / "rights").c_str(), 0600));
    MakeDir(dir_ / "@eaDir");
    for (const char* name : {"hard", "rights", "soft", "kept"}) Add(name);
    ASSERT_EQ(0, link((outside / "secret").c_str(), (dir_ / "@eaDir/hard@MavoEAStream").c_str()));
    ASSERT_EQ(0, link((outside / "rights").c_str(), (dir_ / "@eaDir/rights@MavoEAStream").c_str()));
    ASSERT_EQ(0,
              symlink((outside / "secret").c_str(), (dir_ / "@eaDir/soft@MavoEAStream").c_str()));
    PutStream(dir_ / "kept", damaged);
    ASSERT_EQ(0, symlink((outside / "new").c_str(), (dir_ / "@eaDir/kept@MavoEAKept").c_str()));
    const Snapshot before = TakeSnapshot(dir_.path());
    const Snapshot before_outside = TakeSnapshot(outside.path());
    EXPECT_NE(0, Repair({"--yes"}).status);
    EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
    EXPECT_THAT(Differences(before_outside, TakeSnapshot(outside.path())), IsEmpty());
}

// Before each call the file, its directory and the place of what is kept become links out of the
// share, one run for each.
TEST_F(MendTest, WhoeverExchangesThingsMeanwhileGainsNothing) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    const TempDir outside;
    MakeDir(outside / "ea");
    for (const char* name : {"ea/a@MavoEAStream", "ea/a@MavoEAKept", "secret"}) {
        WriteFile(outside / name, damaged);
    }
    const Snapshot before = TakeSnapshot(outside.path());
    const std::string share = dir_ / "share";
    const auto make = [&] {
        ASSERT_EQ(0, RunProgram("rm -rf " + Quoted(share)).status);
        MakeDir(share);
        WriteFile(share + "/a", Ascii("data"));
        PutStream(share + "/a", damaged);
    };
    const std::vector<std::function<void()>> attacks = {
        [&] {
            (void)rename((share + "/@eaDir").c_str(), (share + "/away").c_str());
            (void)symlink((outside / "ea").c_str(), (share + "/@eaDir").c_str());
        },
        [&] {
            (void)unlink((share + "/@eaDir/a@MavoEAStream").c_str());
            (void)symlink((outside / "secret").c_str(), (share + "/@eaDir/a@MavoEAStream").c_str());
        },
        [&] {
            (void)symlink((outside / "secret").c_str(), (share + "/@eaDir/a@MavoEAKept").c_str());
        },
        [&] {
            (void)unlink((share + "/@eaDir/a@MavoEAStream").c_str());
            (void)link((outside / "secret").c_str(), (share + "/@eaDir/a@MavoEAStream").c_str());
        },
    };
    for (std::size_t i = 0; i < attacks.size(); ++i) {
        bool came = true;
        for (int nth = 1; came; nth += static_cast<int>(SeriesStep())) {
            SCOPED_TRACE(std::to_string(i) + " before call " + std::to_string(nth));
            make();
            came = false;
            RunStoppedAt({"--volume", share + "=1", "check", "-r", "--repair", "--yes", share},
                         dir_.path(), nth, [&] {
                             came = true;
                             attacks[i]();
                         });
            ASSERT_THAT(
                Differences(before, TakeSnapshot(outside.path()), {"atime", "links", "ctime"}),
                IsEmpty());
        }
    }
}

// Promise: "The tool: `check --repair` has what"
TEST_F(MendTest, NothingGoesBeforeWhatIsThereInsteadIsOnDisk) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    PutStream(Add("a"), damaged);
    PutLegacy(dir_ / "a", "colour", Ascii("blue"));
    std::vector<std::string> calls;
    const StoppedRun run = RunStopped(
        {"--volume", dir_.path() + "=1", "check", "-r", "--repair", "--yes", dir_.path()},
        dir_.path(),
        [&](const FileCall& call) {
            if (call.Syncs()) calls.push_back(call.name);
            const auto names = [&](const std::string& name) {
                return std::any_of(call.look_ups.begin(), call.look_ups.end(),
                                   [&](const auto& one) { return one.path.ends_with(name); });
            };
            if (call.name.starts_with("rename") && names("/a@MavoEAStream")) {
                calls.emplace_back("replaced");
            }
            if (!call.name.starts_with("unlink")) return true;
            if (names("/a@MavoEAKept")) calls.emplace_back("kept removed");
            if (names("/a/colour")) calls.emplace_back("stray removed");
            return true;
        },
        Stops::kAtSyncsToo);
    EXPECT_EQ(0, run.status) << run.out << run.err;
    // The new file, the kept one, its directory; the directory again.
    EXPECT_THAT(calls, ElementsAre("fsync", "fsync", "fsync", "replaced", "fsync", "syncfs",
                                   "stray removed", "fsync", "syncfs", "kept removed", "fsync"));
}

// ---- Runs that are killed -----------------------------------------------------------------------

TEST_F(MendTest, KilledAtAnyChangeNothingIsLostAndTheSameCommandFinishes) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    const Bytes misplaced = StreamImage{.attributes = {{"m", Ascii("1")}}}.Build();
    const std::string share = dir_ / "share";
    const std::string volume = share + "=1";
    const auto make = [&] {
        ASSERT_EQ(0, RunProgram("rm -rf " + Quoted(share)).status);
        MakeDir(share);
        for (const char* name : {"a", "b", "c"}) WriteFile(share + "/" + name, Ascii("data"));
        PutStream(share + "/a", damaged);
        PutResource(share + "/b", misplaced);
        PutStream(share + "/b", Image().Build());
        PutStream(share + "/c", Image().Build());
        PutLegacy(share + "/c", "weight", Ascii("heavy"));
    };
    const auto whole = [&] {
        for (const char* name : {"a", "b", "c"}) {
            const Holdings held = HoldingsOf(1, share + "/" + name);
            for (const Attribute& one : Image().attributes) {
                EXPECT_TRUE(held.HasAttribute(one)) << name << one.name;
            }
            EXPECT_TRUE(held.HasFork(Image().fork)) << name;
        }
        EXPECT_TRUE(HoldingsOf(1, share + "/b").HasAttribute({"m", Ascii("1")}));
        EXPECT_TRUE(HoldingsOf(1, share + "/c").HasAttribute({"weight", Ascii("heavy")}));
    };
    const Arguments arguments = {"--volume", volume, "check", "-r", "--repair", "--yes", share};
    KillAtEachChange(
        arguments, dir_.path(), make,
        [&] {
            // The damaged stream itself, what has replaced it, or both.
            const bool has_old = BytesIn(share + "/@eaDir/a@MavoEAStream") == damaged ||
                                 BytesIn(share + "/@eaDir/a@MavoEAKept") == damaged;
            if (!has_old) {
                EXPECT_TRUE(HoldingsOf(1, share + "/a").HasAttribute(Size()));
            }
            const ToolResult again = RunTool(arguments);
            EXPECT_EQ(0, again.status) << again.out << again.err;
            whole();
            EXPECT_THAT(RunTool({"--volume", volume, "check", "-r", share}), Succeeded());
        },
        {}, Says::kNotes);
    // Without "--yes" each of the old files is there at the end as well; nobody has to be asked for
    // the one in "c".
    const Arguments keeping = {"--volume", volume, "check", "-r", "--repair", share};
    KillAtEachChange(
        keeping, dir_.path(),
        [&] {
            make();
            ASSERT_EQ(0, unlink((share + "/@eaDir/c/weight").c_str()));
            PutStream(share + "/c",
                      StreamImage{
                          .attributes = {{"weight", Ascii("heavy")}, Blue(), {"empty", {}}, Size()},
                          .fork = Image().fork}
                          .Build());
        },
        [&] {
            const ToolResult again = RunTool(keeping);
            EXPECT_EQ(0, again.status) << again.out << again.err;
            whole();
            EXPECT_EQ(damaged, BytesIn(share + "/@eaDir/a@MavoEAKept"));
            EXPECT_EQ(misplaced, BytesIn(share + "/@eaDir/b@MavoResKept"));
            EXPECT_EQ(Image().Build(), BytesIn(share + "/@eaDir/b@MavoEAKept"));
            EXPECT_EQ("", RunTool({"--volume", volume, "check", "-r", share}).out);
        },
        {}, Says::kNotes);
}

TEST_F(MendTest, KilledAtAnyChangeAnAppleDoubleFileIsTheOldOrTheNewOne) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    Bytes damaged = Image().Build();
    PutU32(damaged, kTotalSizeAt, 130);
    const std::string share = dir_ / "share";
    const std::string volume = share + "=0";
    const auto make = [&] {
        ASSERT_EQ(0, RunProgram("rm -rf " + Quoted(share)).status);
        MakeDir(share);
        WriteFile(share + "/a", Ascii("data"));
        PutAppleDouble(share + "/a", damaged);
    };
    for (const bool yes : {false, true}) {
        Arguments arguments = {"--volume", volume, "check", "-r", "--repair", share};
        if (yes) arguments.emplace_back("--yes");
        KillAtEachChange(
            arguments, dir_.path(), make,
            [&] {
                const bool has_new = HoldingsOf(0, share + "/a").HasAttribute(Size());
                EXPECT_TRUE(BytesIn(share + "/._a") == damaged || has_new);
                const ToolResult again = RunTool(arguments);
                EXPECT_EQ(0, again.status) << again.out << again.err;
                const Holdings held = HoldingsOf(0, share + "/a");
                for (const Attribute& one : Image().attributes) {
                    EXPECT_TRUE(held.HasAttribute(one)) << one.name;
                }
                EXPECT_TRUE(held.HasFork(Image().fork));
                EXPECT_EQ(yes ? Bytes() : damaged, BytesIn(share + "/.mavoea-kept-._a"));
                EXPECT_EQ("", RunTool({"--volume", volume, "check", "-r", share}).out);
            },
            {}, Says::kNotes);
    }
}

}  // namespace
}  // namespace mavoea::test

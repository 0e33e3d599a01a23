// Nothing is lost with status 0: after cp, mv and convert each item of metadata is at the
// destination, byte for byte, or it is named, the status is 2 and mv has kept the source.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/second_volume.h"
#include "tests/support/snapshot.h"
#include "tests/tool/holdings.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::IsEmpty;

constexpr int kOnlyCopiedTo = 12;

// What a source that is kept may show of having been tried.
const std::set<std::string> kTried = {"atime", "ctime", "mtime of directories"};
// What a source may show of having been looked at: nothing that these tests are about.
const std::set<std::string> kLookedAt = {"atime"};

// ---- What is looked for, and how it is named ----------------------------------------------------

std::string InLowerCase(std::string text) {
    for (char& c : text) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return text;
}

using Words = std::vector<std::string>;

// Whether a line of standard error, other than a note, has one of the paths and one of the words.
bool Names(const std::string& said, const std::vector<std::string>& paths, const Words& words) {
    const auto any_in = [](const std::string& line, const std::vector<std::string>& texts) {
        return std::any_of(texts.begin(), texts.end(), [&line](const std::string& text) {
            return line.find(text) != std::string::npos;
        });
    };
    std::size_t at = 0;
    for (std::size_t end = 0; (end = said.find('\n', at)) != std::string::npos; at = end + 1) {
        const std::string line = said.substr(at, end - at);
        if (line.starts_with("mavoea: ") && !line.starts_with("mavoea: note: ") &&
            any_in(line, paths) && any_in(InLowerCase(line), words)) {
            return true;
        }
    }
    return false;
}

// One thing that an object has.
struct Part {
    Words words;  // in lower case; one of them names it
    std::function<bool(int type, const Holdings&)> there;
};

// Metadata, as something else has left it.
struct Item {
    std::string label;
    // Gives it to an object; false when volumes of that type, or this one, do not have it.
    std::function<bool(int type, const std::string& object)> put;
    std::vector<Part> parts;
};

Part AttributePart(const Attribute& attribute) {
    return {{InLowerCase(attribute.name)},
            [attribute](int, const Holdings& found) { return found.HasAttribute(attribute); }};
}
Part FinderInfoPart(const Bytes& value) {
    return {{"finder info", "finderinfo"},
            [value](int, const Holdings& found) { return found.HasFinderInfo(value); }};
}
Part ForkPart(const Bytes& value) {
    return {{"fork"}, [value](int, const Holdings& found) { return found.HasFork(value); }};
}
Part EntryPart(std::uint32_t id, const Bytes& value, const Words& words) {
    return {words, [id, value](int, const Holdings& found) { return found.HasEntry(id, value); }};
}
Part MarkPart(std::uint32_t mark, const Words& words) {
    return {words, [mark](int, const Holdings& found) { return (found.marks & mark) != 0; }};
}
// Of another service, in the EA directory. Earlier versions' ':' may have become '@'.
Part OtherPart(const std::string& name, const Bytes& value) {
    return {{InLowerCase(name)}, [name, value](int, const Holdings& found) {
                std::string changed = name;
                std::replace(changed.begin(), changed.end(), ':', '@');
                for (const std::string& key : {"@" + name, "/" + name, "/" + changed}) {
                    const auto other = found.others.find(key);
                    if (other != found.others.end() && other->second == value) return true;
                }
                return false;
            }};
}

bool TrySetFileAttribute(const std::string& path, const Attribute& attribute) {
    return lsetxattr(path.c_str(), attribute.name.c_str(), attribute.value.data(),
                     attribute.value.size(), 0) == 0;
}

const Bytes kFinderInfo = Pattern(32, 0x21);
const Bytes kFork = Pattern(20000, 0x22);

Item AttributesItem(const std::string& label, const std::vector<Attribute>& attributes) {
    Item item = {label,
                 [attributes](int type, const std::string& object) {
                     const Bytes stream = StreamImage{.attributes = attributes}.Build();
                     if (UsesAppleDouble(type)) PutAppleDouble(object, stream);
                     if (UsesEaDirectory(type)) PutStream(object, stream);
                     return type != 7 ||
                            std::all_of(attributes.begin(), attributes.end(),
                                        [&](const Attribute& attribute) {
                                            return attribute.flags == 0 &&
                                                   TrySetFileAttribute(object, attribute);
                                        });
                 },
                 {}};
    for (const Attribute& attribute : attributes) item.parts.push_back(AttributePart(attribute));
    return item;
}

// Entries of one AppleDouble file, where a volume has one of its kind for an object. A resource
// file that has more than Finder info and fork begins with a record: the fork comes behind it.
bool PutEntries(int type, const std::string& object, const Entries& entries) {
    if (UsesAppleDouble(type)) PutAppleDouble(object, AppleDoubleOf(entries));
    if (UsesEaDirectory(type)) PutResource(object, ResourceFileOf(entries));
    return type != 7;
}

Item EntryItem(const std::string& label, std::uint32_t id, const Bytes& value, const Words& words) {
    return {label,
            [id, value](int type, const std::string& object) {
                return PutEntries(type, object, {{kFinderInfoEntry, Repeat(0, 32)}, {id, value}});
            },
            {EntryPart(id, value, words)}};
}

Item RecordItem(const std::string& label, const RecordContents& contents,
                const std::vector<Part>& parts) {
    return {label,
            [contents](int type, const std::string& object) {
                if (type != 2) return false;
                SetFileAttribute(object, kRecordAttribute, RecordOf(contents));
                return true;
            },
            parts};
}

Item StreamItem(const std::string& label, const StreamImage& stream,
                const std::vector<Part>& parts) {
    return {label,
            [stream](int type, const std::string& object) {
                if (UsesEaDirectory(type)) PutStream(object, stream.Build());
                return UsesEaDirectory(type);
            },
            parts};
}

Item MarkItem(const std::string& label, std::uint32_t mark) {
    return {label,
            [mark](int, const std::string& object) {
                SetMarks(object, mark);
                return true;
            },
            {MarkPart(mark, {InLowerCase(label), "mark"})}};
}

Item LockItem() {
    const auto locked = [](int type, const Holdings& found) {
        return UsesEaDirectory(type) ? (found.marks & kLockedMark) != 0 : !found.writable;
    };
    return {"Lock",
            [](int type, const std::string& object) {
                if (UsesEaDirectory(type)) {
                    SetMarks(object, kLockedMark);
                } else {
                    chmod(object.c_str(), 0444);
                }
                return true;
            },
            {{{"lock"}, locked}}};
}

Item ThirteenEntriesItem() {
    const struct {
        std::uint32_t id;
        Bytes value;
        Words words;
    } others[] = {
        {3, Ascii("real name"), {"real name"}},     {4, Ascii("comment"), {"comment"}},
        {5, Pattern(128, 5), {"black and white"}},  {6, Pattern(256, 6), {"colour"}},
        {8, Repeat(0x22, 16), {"dates"}},           {10, Repeat(0x33, 4), {"macintosh file info"}},
        {11, Repeat(0x44, 8), {"prodos"}},          {12, Repeat(0x55, 2), {"ms-dos"}},
        {13, Ascii("SHORTN~1"), {"short name"}},    {14, Hex("00 00 04 04"), {"afp file info"}},
        {15, Hex("00 00 00 77"), {"directory id"}},
    };
    Entries entries;
    std::vector<Part> parts = {ForkPart(kFork), FinderInfoPart(kFinderInfo)};
    for (const auto& [id, value, words] : others) {
        entries.emplace_back(id, value);
        parts.push_back(EntryPart(id, value, words));
    }
    entries.emplace_back(kFinderInfoEntry, kFinderInfo);
    entries.emplace_back(kForkEntry, kFork);
    return {"ThirteenEntries",
            [entries](int type, const std::string& object) {
                return PutEntries(type, object, entries);
            },
            parts};
}

// What earlier versions kept.
Item LegacyItem() {
    return {"LegacyFolder",
            [](int type, const std::string& object) {
                if (!UsesEaDirectory(type)) return false;
                PutLegacy(object, "user.color", Ascii("blue"));
                PutLegacy(object, "user.empty", {});
                PutLegacy(object, "MAVO:Resource", PlainAppleDouble(kFinderInfo, kFork));
                return true;
            },
            {AttributePart({"user.color", Ascii("blue")}), AttributePart({"user.empty", {}}),
             FinderInfoPart(kFinderInfo), ForkPart(kFork)}};
}
Item EarlierAppleDoubleItem() {
    return {"EarlierAppleDouble",
            [](int type, const std::string& object) {
                if (!UsesEaDirectory(type)) return false;
                PutAppleDouble(
                    object,
                    MacSidecar({{{"user.a", Ascii("1")}, {"user.empty", {}}}, kFinderInfo, kFork})
                        .bytes);
                return true;
            },
            {AttributePart({"user.a", Ascii("1")}), AttributePart({"user.empty", {}}),
             FinderInfoPart(kFinderInfo), ForkPart(kFork)}};
}
Item OtherServicesItem() {
    const std::string thumbnail = "MAVOPHOTO:THUMB_S.jpg";
    return {"OtherServices",
            [thumbnail](int type, const std::string& object) {
                if (!UsesEaDirectory(type)) return false;
                PutLegacy(object, thumbnail, Pattern(600, 3));
                PutLegacy(object, "a:b", Ascii("no attribute"));
                PutKind(object, "OtherKind", Pattern(700, 4));
                return true;
            },
            {OtherPart(thumbnail, Pattern(600, 3)), OtherPart("a:b", Ascii("no attribute")),
             OtherPart("OtherKind", Pattern(700, 4))}};
}

std::vector<Attribute> ManyAttributes() {
    std::vector<Attribute> many;
    for (int i = 1000; i < 2000; ++i) {
        many.push_back({"user.n" + std::to_string(i), Ascii("value " + std::to_string(i))});
    }
    return many;
}

// What directories have as well.
std::vector<Item> ItemsOfAll() {
    return {
        AttributesItem("Attribute", {{"user.colour", Pattern(300)}}),
        {"FinderInfo",
         [](int type, const std::string& object) {
             if (type == 2) {
                 SetFileAttribute(object, kRecordAttribute, RecordOf({.finder_info = kFinderInfo}));
             }
             return PutEntries(type, object, {{kFinderInfoEntry, kFinderInfo}, {kForkEntry, {}}});
         },
         {FinderInfoPart(kFinderInfo)}},
        EntryItem("Comment", kCommentEntry, Ascii("a comment"), {"comment"}),
        LegacyItem(),
        EarlierAppleDoubleItem(),
        OtherServicesItem(),
        MarkItem("Hidden", kHiddenMarkBit),
    };
}

std::vector<Item> ItemsOfFiles() {
    const Bytes unknown = Pattern(40, 7);
    std::vector<Item> items = ItemsOfAll();
    const std::vector<Item> more = {
        AttributesItem("EmptyAttribute", {{"user.empty", {}}, {"user.full", Ascii("full")}}),
        AttributesItem("AttributeOfMacs", {{"com.apple.FinderComment", Pattern(70)}}),
        AttributesItem("AttributeWithFlags", {{"user.flagged", Ascii("x"), 0x1234}}),
        AttributesItem("LargeAttribute", {{"user.large", Pattern(100000)}}),
        AttributesItem("ManyAttributes", ManyAttributes()),
        {"Fork",
         [](int type, const std::string& object) {
             return PutEntries(type, object,
                               {{kFinderInfoEntry, Repeat(0, 32)}, {kForkEntry, kFork}});
         },
         {ForkPart(kFork)}},
        EntryItem("RealName", kRealNameEntry, Ascii("a real name"), {"real name"}),
        EntryItem("ShortName", kShortNameEntry, Ascii("SHORTN~1"), {"short name"}),
        EntryItem("Dates", kDatesEntry, Repeat(0x11, 16), {"dates"}),
        EntryItem("AfpWord", kAfpInfoEntry, Hex("00 00 04 04"), {"afp file info"}),
        EntryItem("UnknownEntry", 0x777, unknown, {"777", "1911"}),
        ThirteenEntriesItem(),
        RecordItem("FinderInfoInTheRecord", {.finder_info = kFinderInfo},
                   {FinderInfoPart(kFinderInfo)}),
        RecordItem("CommentInTheRecord", {.comment = Ascii("a comment")},
                   {EntryPart(kCommentEntry, Ascii("a comment"), {"comment"})}),
        RecordItem("DatesInTheRecord", {.dates = Repeat(0x11, 16)},
                   {EntryPart(kDatesEntry, Repeat(0x11, 16), {"dates"})}),
        RecordItem("AfpWordInTheRecord", {.afp_info = Hex("00 00 04 04")},
                   {EntryPart(kAfpInfoEntry, Hex("00 00 04 04"), {"afp file info"})}),
        StreamItem("FinderInfoInTheStream", {.finder_info = kFinderInfo},
                   {FinderInfoPart(kFinderInfo)}),
        StreamItem("ForkInTheStream", {.fork = kFork}, {ForkPart(kFork)}),
        StreamItem(
            "AllInTheStream",
            {.attributes = {{"user.a", Ascii("1")}}, .fork = kFork, .finder_info = kFinderInfo},
            {AttributePart({"user.a", Ascii("1")}), ForkPart(kFork), FinderInfoPart(kFinderInfo)}),
        MarkItem("Archive", kArchiveMark),
        LockItem(),
    };
    items.insert(items.end(), more.begin(), more.end());
    return items;
}

// ---- Ways to take them --------------------------------------------------------------------------

enum class How { kCopy, kMove, kMoveAcross, kConvert };

struct Way {
    How how;
    int from;
    int to;
};
void PrintTo(const Way& way, std::ostream* out) {
    constexpr const char* kNames[] = {"Cp", "Mv", "MvAcross", "Convert"};
    *out << kNames[static_cast<int>(way.how)] << "From" << way.from << "To" << way.to;
}
std::string NameOf(const ::testing::TestParamInfo<Way>& info) {
    return ::testing::PrintToString(info.param);
}

std::vector<Way> Ways(const std::vector<How>& hows, const std::vector<int>& from,
                      const std::vector<int>& to) {
    std::vector<Way> ways;
    for (const How how : hows) {
        for (const int one : from) {
            for (const int other : to) ways.push_back({how, one, other});
        }
    }
    return Thinned(ways);
}

const std::vector<int> kTypes = {0, 1, 2, 7};
const std::vector<How> kHows = {How::kCopy, How::kMove, How::kMoveAcross, How::kConvert};

std::vector<Way> EveryWay() {
    std::vector<Way> ways = Ways(kHows, kTypes, kTypes);
    for (const Way& way : Ways({How::kCopy, How::kConvert}, {1, 2}, {kOnlyCopiedTo})) {
        ways.push_back(way);
    }
    return ways;
}

// The place of a source, and that of a destination.
class Places {
 public:
    Places(const Way& way, const std::string& there) : Places(way, FastDirectory(), there) {}
    Places(const Way& way, const std::string& here, const std::string& there)
        : way_(way), here_(here), there_(there) {
        MakeDir(From());
        MakeDir(To());
    }

    std::string From(const std::string& name = {}) const { return In(here_ / "from", name); }
    std::string To(const std::string& name = {}) const { return In(there_ / "to", name); }

    // Takes an object to its destination, of another name or not, and remembers how the source was.
    ToolResult Take(const std::string& name, const std::string& new_name,
                    const Arguments& options = {}, Limits limits = {}) {
        if (Exists(here_ / "from")) before_ = TakeSnapshot(From());
        return RunTool(WithVolumes(Command(options, {From(name), To(new_name)})), {}, limits);
    }

    // The same within a tree.
    ToolResult TakeTree(const std::string& name, const Arguments& options = {}) {
        Arguments all = options;
        if (!Moves()) all.push_back("-r");
        return Take(name, name, all);
    }

    Arguments WithVolumes(Arguments arguments) const {
        arguments.insert(arguments.begin(), {"--volume", From() + "=" + std::to_string(way_.from),
                                             "--volume", To() + "=" + std::to_string(way_.to)});
        return arguments;
    }

    bool Moves() const { return way_.how == How::kMove || way_.how == How::kMoveAcross; }

    void ExpectSourceWhole() const {
        EXPECT_THAT(Differences(before_, TakeSnapshot(From()), Moves() ? kTried : kLookedAt),
                    IsEmpty());
    }
    void ExpectSourceGone() const {
        std::vector<std::string> names = NamesIn(From());
        EXPECT_THAT(names, IsEmpty());
    }

 private:
    static std::string In(const std::string& directory, const std::string& name) {
        return name.empty() ? directory : directory + '/' + name;
    }

    Arguments Command(const Arguments& options, const Arguments& paths) const {
        Arguments command;
        if (way_.how == How::kConvert) {
            command = {"convert", "--to", std::to_string(way_.to)};
        } else {
            command = {Moves() ? "mv" : "cp"};
        }
        if (way_.how != How::kConvert) command.push_back("-T");
        command.insert(command.end(), options.begin(), options.end());
        command.insert(command.end(), paths.begin(), paths.end());
        return command;
    }

    Way way_;
    TempDir here_;
    TempDir there_;
    Snapshot before_;
};

class WayTest : public ::testing::TestWithParam<Way> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(FastDirectory());
        if (GetParam().how != How::kMoveAcross) return;
        second_.emplace();
        if (!second_->ok()) GTEST_SKIP() << "no second file system here; run this test as the root";
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second_->path());
    }

    static int from() { return GetParam().from; }
    static int to() { return GetParam().to; }

    std::unique_ptr<Places> MakePlaces() const {
        return std::make_unique<Places>(GetParam(), second_ ? second_->path() : FastDirectory());
    }

    // What the promise says of one object.
    static void ExpectKept(const Places& places, const std::string& name,
                           const std::string& new_name, const std::vector<Part>& parts,
                           const ToolResult& result) {
        const std::string from = places.From(name);
        const std::string to = places.To(new_name);
        const Holdings found = HoldingsOf(GetParam().to, to);
        bool all = true;
        for (const Part& part : parts) {
            if (part.there(GetParam().to, found)) continue;
            all = false;
            EXPECT_TRUE(Names(result.err, {from, to}, part.words))
                << "lost without a word: " << ::testing::PrintToString(part.words);
        }
        EXPECT_EQ(all ? 0 : 2, result.status) << result.err;
        if (all && places.Moves()) {
            places.ExpectSourceGone();
        } else {
            places.ExpectSourceWhole();
        }
    }

    std::optional<SecondVolume> second_;
};
INSTANTIATE_TEST_SUITE_P(EveryWay, WayTest, ::testing::ValuesIn(EveryWay()), NameOf);

TEST_P(WayTest, EveryItemOfAFileArrivesOrIsNamed) {
    for (const Item& item : ItemsOfFiles()) {
        SCOPED_TRACE(item.label);
        const auto places = MakePlaces();
        WriteFile(places->From("x"), Ascii("data of x"));
        if (!item.put(from(), places->From("x"))) continue;
        const ToolResult result = places->Take("x", "y");
        ExpectKept(*places, "x", "y", item.parts, result);
        EXPECT_EQ(Ascii("data of x"), BytesIn(places->To("y")));
    }
}

TEST_P(WayTest, EveryItemOfADirectoryArrivesOrIsNamed) {
    for (const Item& item : ItemsOfAll()) {
        SCOPED_TRACE(item.label);
        const auto places = MakePlaces();
        MakeDir(places->From("d"));
        WriteFile(places->From("d/file"), Ascii("data"));
        if (!item.put(from(), places->From("d"))) continue;
        const ToolResult result = places->TakeTree("d");
        ExpectKept(*places, "d", "d", item.parts, result);
        EXPECT_EQ(Ascii("data"), BytesIn(places->To("d/file")));
    }
}

TEST_P(WayTest, WhatHasNoMetadataTravelsWhateverItsName) {
    for (const std::size_t length : {254U, 255U}) {
        const std::string name(length, 'n');
        const auto places = MakePlaces();
        WriteFile(places->From(name), Ascii("data"));
        EXPECT_THAT(places->Take(name, name), Succeeded());
        EXPECT_EQ(Ascii("data"), BytesIn(places->To(name)));
        MakeDir(places->From("d"));
        WriteFile(places->From("d/" + name), Ascii("data"));
        EXPECT_THAT(places->TakeTree("d"), Succeeded());
        EXPECT_EQ(Ascii("data"), BytesIn(places->To("d/" + name)));
    }
}

TEST_P(WayTest, MetadataOfALongNameArrivesOrIsNamed) {
    if (UsesAppleDouble(from())) GTEST_SKIP() << "such names have none there";
    for (const std::size_t length : {243U, 254U, 255U}) {
        SCOPED_TRACE(length);
        const std::string name(length, 'n');
        const Item item = AttributesItem("Attribute", {{"user.colour", Pattern(300)}});
        const auto places = MakePlaces();
        WriteFile(places->From(name), Ascii("data"));
        ASSERT_TRUE(item.put(from(), places->From(name)));
        const ToolResult result = places->Take(name, name);
        std::vector<Part> parts = item.parts;
        parts[0].words.push_back("name");  // is too long: which says it of all
        ExpectKept(*places, name, name, parts, result);
        EXPECT_EQ(Ascii("data"), BytesIn(places->To(name)));
    }
}

// The names "x" and "y" of one file, with what each of them has.
std::map<std::string, std::vector<Part>> MakeTwoNames(const Places& places, int from) {
    MakeDir(places.From("d"));
    WriteFile(places.From("d/x"), Ascii("data"));
    EXPECT_EQ(0, link(places.From("d/x").c_str(), places.From("d/y").c_str()));
    std::map<std::string, std::vector<Part>> parts;
    for (const std::string name : {"x", "y"}) {
        const bool is_x = name == "x";
        const Attribute colour = {"user.colour", Ascii(is_x ? "blue" : "red")};
        const Attribute own = {"user.of-" + name, Ascii(name)};
        if (from == 7) continue;  // where names have nothing of their own
        const Bytes finder_info = Pattern(32, is_x ? 1 : 2);
        const Bytes stream =
            StreamImage{.attributes = {colour, own}, .finder_info = finder_info}.Build();
        parts[name] = {AttributePart(colour), AttributePart(own), FinderInfoPart(finder_info)};
        if (UsesAppleDouble(from)) {
            PutAppleDouble(places.From("d/" + name), stream);
        } else {
            PutStream(places.From("d/" + name), stream);
        }
    }
    return parts;
}

TEST_P(WayTest, OneNameOfAFileDoesNotSpeakForTheOther) {
    const auto places = MakePlaces();
    const auto parts = MakeTwoNames(*places, from());
    const bool copies = GetParam().how == How::kCopy;
    const ToolResult result =
        places->TakeTree("d", copies ? Arguments{"--preserve=links"} : Arguments{});
    bool all = true;
    for (const auto& [name, some] : parts) {
        const std::string to_path = places->To("d/" + name);
        const Holdings found = HoldingsOf(to(), to_path);
        for (const Part& part : some) {
            if (part.there(to(), found)) continue;
            all = false;
            EXPECT_TRUE(Names(result.err, {places->From("d/" + name), to_path}, part.words))
                << name << ", lost without a word: " << ::testing::PrintToString(part.words);
        }
        // The record is the file's, not a name's: it must not hide what this one has.
        if (to() == 2 && result.status == 0) {
            const ToolResult got = RunTool(places->WithVolumes({"get", to_path, kFinderInfoName}));
            EXPECT_EQ(Pattern(32, name == "x" ? 1 : 2), got.bytes()) << name;
        }
    }
    // Being one file is something, too.
    const bool linked = std::filesystem::equivalent(places->To("d/x"), places->To("d/y"));
    if (!linked) {
        EXPECT_THAT(result.err, ::testing::HasSubstr("being one file with "));
    }
    EXPECT_EQ(all && linked ? 0 : 2, result.status) << result.err;
    for (const char* name : {"d/x", "d/y"}) EXPECT_EQ(Ascii("data"), BytesIn(places->To(name)));
    if (!all || !linked || !places->Moves()) places->ExpectSourceWhole();
}

TEST_P(WayTest, NamesThatAreCopiedApartHaveEachTheirOwn) {
    if (GetParam().how != How::kCopy) GTEST_SKIP() << "there they stay names of one file";
    const auto places = MakePlaces();
    const auto parts = MakeTwoNames(*places, from());
    const ToolResult result = places->TakeTree("d");
    EXPECT_FALSE(std::filesystem::equivalent(places->To("d/x"), places->To("d/y")));
    for (const char* name : {"d/x", "d/y"}) EXPECT_EQ(Ascii("data"), BytesIn(places->To(name)));
    bool all = true;
    for (const auto& [name, some] : parts) {
        const std::string to_path = places->To("d/" + name);
        const Holdings found = HoldingsOf(to(), to_path);
        for (const Part& part : some) {
            if (part.there(to(), found)) continue;
            all = false;
            EXPECT_TRUE(Names(result.err, {places->From("d/" + name), to_path}, part.words))
                << name << ", lost without a word: " << ::testing::PrintToString(part.words);
        }
        const Bytes others = Ascii(name == "x" ? "y" : "x");
        EXPECT_FALSE(
            found.HasAttribute({"user.of-" + std::string(others.begin(), others.end()), others}));
    }
    EXPECT_EQ(all ? 0 : 2, result.status) << result.err;
    places->ExpectSourceWhole();
}

// A "._" file that is no AppleDouble file, or belongs to nothing, is a file like any other.
TEST_P(WayTest, FilesThatOnlyLookLikeMetadataTravelAsFiles) {
    Bytes version1 = AllMacFiles()[1].bytes;
    version1[5] = 1;
    const std::map<std::string, Bytes> files = {
        {"x", Ascii("data of x")},
        {"._x", Ascii("not what its name says")},
        {"._alone", Ascii("neither")},
        {"v", Ascii("data of v")},
        {"._v", version1},
        {"z", Ascii("data of z")},
        {"._z", {}},
        {"._missing", AllMacFiles()[0].bytes},
        {"._", Ascii("two characters")},
    };
    const auto places = MakePlaces();
    MakeDir(places->From("d"));
    for (const auto& [name, bytes] : files) WriteFile(places->From("d/" + name), bytes);
    const ToolResult result = places->TakeTree("d");
    EXPECT_EQ(0, result.status) << result.err;
    for (const auto& [name, bytes] : files) {
        EXPECT_EQ(bytes, BytesIn(places->To("d/" + name))) << name;
    }
    if (!places->Moves()) places->ExpectSourceWhole();
}

TEST_P(WayTest, AFileInThePlaceOfMetadataDoesNotDisplaceIt) {
    if (UsesAppleDouble(from())) GTEST_SKIP() << "there the place is taken";
    const Item item = AttributesItem("Attribute", {{"user.colour", Pattern(300)}});
    const auto places = MakePlaces();
    MakeDir(places->From("d"));
    WriteFile(places->From("d/x"), Ascii("data of x"));
    WriteFile(places->From("d/._x"), Ascii("not what its name says"));
    ASSERT_TRUE(item.put(from(), places->From("d/x")));
    const ToolResult result = places->TakeTree("d");
    const bool file = BytesIn(places->To("d/._x")) == Ascii("not what its name says");
    const bool attribute = item.parts[0].there(to(), HoldingsOf(to(), places->To("d/x")));
    const int without = GetParam().how == How::kConvert ? 2 : 1;
    EXPECT_EQ(!file ? without : attribute ? 0 : 2, result.status) << result.err;
    if (!file) {
        EXPECT_TRUE(Names(result.err, {"d/._x"}, {"._x"})) << result.err;
    }
    if (!attribute) {
        EXPECT_TRUE(
            Names(result.err, {places->From("d/x"), places->To("d/x")}, {"user.colour", "._x"}))
            << result.err;
    }
    if (!places->Moves() || result.status != 0) places->ExpectSourceWhole();
}

TEST_P(WayTest, WhatBelongsToNoObjectGoesWithItsDirectory) {
    if (!UsesEaDirectory(from())) GTEST_SKIP() << "there is no such thing there";
    const std::map<std::string, Bytes> files = {
        {"index.db", Pattern(500, 1)},
        {"gone@OtherKind", Pattern(600, 2)},
        {"gone/MAVOPHOTO:THUMB_S.jpg", Pattern(700, 3)},
    };
    const auto places = MakePlaces();
    MakeDir(places->From("d"));
    WriteFile(places->From("d/x"), Ascii("data"));
    MakeDir(places->From("d/@eaDir"));
    MakeDir(places->From("d/@eaDir/gone"));
    for (const auto& [name, bytes] : files) WriteFile(places->From("d/@eaDir/" + name), bytes);
    const ToolResult result = places->TakeTree("d");
    const bool travels = UsesEaDirectory(to());
    EXPECT_EQ(travels ? 0 : 2, result.status) << result.err;
    for (const auto& [name, bytes] : files) {
        SCOPED_TRACE(name);
        if (travels) {
            EXPECT_EQ(bytes, BytesIn(places->To("d/@eaDir/" + name)));
        } else {
            EXPECT_TRUE(Names(result.err, {places->From("d"), places->To("d")},
                              {InLowerCase(name.substr(name.rfind('/') + 1))}))
                << result.err;
        }
    }
    EXPECT_EQ(Ascii("data"), BytesIn(places->To("d/x")));
    if (!travels || !places->Moves()) places->ExpectSourceWhole();
}

// Metadata of an object that is gone is named where it is left behind.
TEST_P(WayTest, MetadataOfNothingIsNotLeftBehindInSilence) {
    if (!UsesEaDirectory(from())) GTEST_SKIP() << "there is no such thing there";
    const Bytes stream = StreamImage{.attributes = {{"user.a", Ascii("1")}}}.Build();
    const auto places = MakePlaces();
    MakeDir(places->From("d"));
    PutStream(places->From("d/gone"), stream);
    const ToolResult result = places->TakeTree("d");
    const bool arrived = BytesIn(places->To("d/@eaDir/gone@MavoEAStream")) == stream;
    EXPECT_EQ(arrived ? 0 : 2, result.status) << result.err;
    if (!arrived) {
        EXPECT_TRUE(Names(result.err, {places->From("d"), places->To("d")}, {"gone"}))
            << result.err;
    }
    if (!arrived || !places->Moves()) places->ExpectSourceWhole();
}

// ---- Where there is not room for all ------------------------------------------------------------

class FullTest : public ::testing::TestWithParam<Way> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(FastDirectory());
    }

    // A fork of five pages and some, with an attribute; then the rule.
    static void PutAll(const std::string& object) {
        const int type = GetParam().from;
        if (UsesAppleDouble(type)) {
            PutAppleDouble(object, Stream(kFork));
        } else {
            PutStream(object, Stream({}));
            PutResource(object, PlainAppleDouble(kFinderInfo, kFork));
        }
    }
    static Bytes Stream(const Bytes& fork) {
        return StreamImage{
            .attributes = {{"user.a", Pattern(5000, 1)}}, .fork = fork, .finder_info = kFinderInfo}
            .Build();
    }

    static void ExpectKept(const Places& places, const ToolResult& result) {
        const Holdings found = HoldingsOf(GetParam().to, places.To("y"));
        const bool data = BytesIn(places.To("y")) == Ascii("data");
        bool all = data;
        const std::vector<std::string> paths = {places.From("x"), places.To()};
        for (const Part& part : {AttributePart({"user.a", Pattern(5000, 1)}), ForkPart(kFork),
                                 FinderInfoPart(kFinderInfo)}) {
            if (part.there(GetParam().to, found)) continue;
            all = false;
            Words words = part.words;
            words.insert(words.end(), {"no space left", "file too large"});
            EXPECT_TRUE(Names(result.err, paths, words))
                << "lost without a word: " << ::testing::PrintToString(part.words);
        }
        EXPECT_EQ(all ? 0 : data ? 2 : 1, result.status) << result.err;
        if (all && places.Moves()) {
            places.ExpectSourceGone();
        } else {
            places.ExpectSourceWhole();
        }
    }
};
INSTANTIATE_TEST_SUITE_P(EveryWay, FullTest,
                         ::testing::ValuesIn(Ways({How::kCopy, How::kMoveAcross, How::kConvert},
                                                  {0, 1, 2}, {0, 1, 2})),
                         NameOf);

TEST_P(FullTest, AForkThatIsCutIsNotTakenForWhole) {
    constexpr std::size_t kPage = 4096;
    for (const std::size_t pages_left : {1U, 2U, 3U, 4U, 5U, 6U, 7U, 8U, 9U, 12U}) {
        SCOPED_TRACE(pages_left);
        const SecondVolume small("size=64k", true);
        if (!small.ok()) GTEST_SKIP() << "nothing can be mounted here; run this test as the root";
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(small.path());
        WriteFile(small.path() + "/filler", Pattern(kPage * (16 - pages_left)));
        Places places(GetParam(), small.path());
        WriteFile(places.From("x"), Ascii("data"));
        PutAll(places.From("x"));
        ExpectKept(places, places.Take("x", "y"));
    }
}

TEST_P(FullTest, ALimitOfAFilesSizeCutsNothingInSilence) {
    const SecondVolume second;
    if (!second.ok()) GTEST_SKIP() << "no second file system here; run this test as the root";
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second.path());
    for (const std::size_t size : {3000U, 6000U, 15000U, 30000U}) {
        SCOPED_TRACE(size);
        Places places(GetParam(), second.path());
        WriteFile(places.From("x"), Ascii("data"));
        PutAll(places.From("x"));
        ExpectKept(places, places.Take("x", "y", {}, {.file_size = size}));
    }
}

// ---- A source that cannot be written ------------------------------------------------------------

class ReadOnlyTest : public ::testing::TestWithParam<Way> {};
INSTANTIATE_TEST_SUITE_P(EveryWay, ReadOnlyTest,
                         ::testing::ValuesIn(Ways({How::kCopy, How::kConvert}, {0, 1, 2, 7},
                                                  {0, 1, 2, 7})),
                         NameOf);

TEST_P(ReadOnlyTest, WhatEarlierVersionsLeftIsCopiedFromWhereItLies) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(FastDirectory());
    for (const Item& item : ItemsOfAll()) {
        SCOPED_TRACE(item.label);
        const SecondVolume second("", true);
        if (!second.ok()) GTEST_SKIP() << "nothing can be mounted here; run this test as the root";
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second.path());
        Places places(GetParam(), second.path(), FastDirectory());
        WriteFile(places.From("x"), Ascii("data"));
        if (!item.put(GetParam().from, places.From("x"))) continue;
        ASSERT_EQ(0,
                  mount(nullptr, second.path().c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr));
        const ToolResult result = places.Take("x", "y");
        const Holdings found = HoldingsOf(GetParam().to, places.To("y"));
        bool all = true;
        for (const Part& part : item.parts) {
            if (part.there(GetParam().to, found)) continue;
            all = false;
            EXPECT_TRUE(Names(result.err, {places.From("x"), places.To("y")}, part.words))
                << "lost without a word: " << ::testing::PrintToString(part.words);
        }
        EXPECT_EQ(all ? 0 : 2, result.status) << result.err;
        places.ExpectSourceWhole();
        // Volumes of the same kinds keep all of it.
        const bool earlier = item.label == "LegacyFolder" || item.label == "EarlierAppleDouble";
        EXPECT_TRUE(all || !earlier || !UsesEaDirectory(GetParam().to));
        ASSERT_EQ(0, mount(nullptr, second.path().c_str(), nullptr, MS_REMOUNT, nullptr));
    }
}

// ---- Losing on purpose --------------------------------------------------------------------------

// Type 7 on the file systems of tests takes neither Finder info nor fork.
class AllowedTest : public ::testing::TestWithParam<Way> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(FastDirectory());
        second_.emplace();
        if (!second_->ok()) GTEST_SKIP() << "no second file system here; run this test as the root";
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second_->path());
        places_.emplace(GetParam(),
                        GetParam().how == How::kMoveAcross ? second_->path() : FastDirectory());
        WriteFile(places_->From("x"), Ascii("data"));
    }
    std::optional<SecondVolume> second_;
    std::optional<Places> places_;
};
INSTANTIATE_TEST_SUITE_P(Ways, AllowedTest,
                         ::testing::ValuesIn(Ways({How::kCopy, How::kMove, How::kMoveAcross},
                                                  {0, 1, 2}, {7})),
                         NameOf);

TEST_P(AllowedTest, WhatMayBeLostIsNamedAllTheSame) {
    ASSERT_TRUE(PutEntries(GetParam().from, places_->From("x"),
                           {{kFinderInfoEntry, Repeat(0, 32)}, {kForkEntry, kFork}}));
    const ToolResult result = places_->Take("x", "y", {"--allow-loss"});
    EXPECT_EQ(2, result.status);
    EXPECT_TRUE(Names(result.err, {places_->From("x"), places_->To("y")}, {"fork"})) << result.err;
    EXPECT_EQ(Ascii("data"), BytesIn(places_->To("y")));
    if (places_->Moves()) {
        places_->ExpectSourceGone();
    } else {
        places_->ExpectSourceWhole();
    }
}

TEST_P(AllowedTest, WithoutAnythingToLoseItChangesNothing) {
    const Item item = AttributesItem("Attribute", {{"user.colour", Pattern(300)}});
    ASSERT_TRUE(item.put(GetParam().from, places_->From("x")));
    const ToolResult result = places_->Take("x", "y", {"--allow-loss"});
    EXPECT_EQ(0, result.status) << result.err;
    EXPECT_TRUE(item.parts[0].there(7, HoldingsOf(7, places_->To("y"))));
    if (places_->Moves()) {
        places_->ExpectSourceGone();
    } else {
        places_->ExpectSourceWhole();
    }
}

// ---- "._" files go with their objects, and stay where they are none -----------------------------

class SidecarTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume_.path());
        MakeDir(In("other"));
        WriteFile(In("a"), Ascii("data"));
    }
    std::string In(const std::string& name) const { return volume_.path() + '/' + name; }

    void ExpectNoneOfANewFile() const {
        WriteFile(In("a"), Ascii("new"));
        const ToolResult list = volume_.Run({"list", In("a")});
        EXPECT_THAT(list, Succeeded());
        EXPECT_EQ("", list.out);
    }

    const Volume volume_{GetParam(), FastDirectory()};
    const Attribute attribute_ = {"user.a", Ascii("1")};
    const Bytes apple_double_ = MacSidecar({{{"user.a", Ascii("1")}}, kFinderInfo, kFork}).bytes;
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, SidecarTest,
                         ::testing::ValuesIn(Types({0, 1, 2, 3, 5, 6, 7, 10})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(SidecarTest, ItGoesWhereItsObjectGoes) {
    if (GetParam() == 7) GTEST_SKIP() << "there it is a file like any other";
    for (const std::string to : {"b", "other/b"}) {
        SCOPED_TRACE(to);
        WriteFile(In("a"), Ascii("data"));
        WriteFile(In("._a"), apple_double_);
        const ToolResult result = volume_.Run({"mv", In("a"), In(to)});
        EXPECT_EQ(0, result.status) << result.err;
        EXPECT_FALSE(Exists(In("._a")));
        const Holdings found = HoldingsOf(GetParam(), In(to));
        EXPECT_TRUE(found.HasAttribute(attribute_));
        EXPECT_TRUE(found.HasFinderInfo(kFinderInfo));
        EXPECT_TRUE(found.HasFork(kFork));
        EXPECT_EQ("1", volume_.Run({"get", In(to), "user.a"}).out);
        ExpectNoneOfANewFile();
    }
}

TEST_P(SidecarTest, ItGoesToAnotherFileSystem) {
    if (GetParam() == 7) GTEST_SKIP() << "there it is a file like any other";
    const SecondVolume second;
    if (!second.ok()) GTEST_SKIP() << "no second file system here; run this test as the root";
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second.path());
    WriteFile(In("._a"), apple_double_);
    const ToolResult result =
        volume_.Run({"--volume", second.path() + "=" + std::to_string(GetParam()), "mv", In("a"),
                     second.path() + "/b"});
    EXPECT_EQ(0, result.status) << result.err;
    EXPECT_FALSE(Exists(In("._a")));
    const Holdings found = HoldingsOf(GetParam(), second.path() + "/b");
    EXPECT_TRUE(found.HasAttribute(attribute_));
    EXPECT_TRUE(found.HasFork(kFork));
}

TEST_P(SidecarTest, ItGoesThoughAStreamIsShownInItsPlace) {
    if (!UsesEaDirectory(GetParam())) GTEST_SKIP() << "there is no such thing there";
    const Bytes stream = StreamImage{.attributes = {{"user.s", Ascii("2")}}}.Build();
    WriteFile(In("._a"), apple_double_);
    PutStream(In("a"), stream);
    const ToolResult moved = volume_.Run({"mv", In("a"), In("b")});
    EXPECT_FALSE(Exists(In("._a")));
    const Holdings found = HoldingsOf(GetParam(), In("b"));
    EXPECT_TRUE(found.HasAttribute({"user.s", Ascii("2")}));
    EXPECT_TRUE(BytesIn(In("._b")) == apple_double_ || found.HasAttribute(attribute_) ||
                moved.status == 2)
        << "lost without a word";
    WriteFile(In("a"), Ascii("data"));
    WriteFile(In("._a"), apple_double_);
    PutStream(In("a"), stream);
    EXPECT_EQ(0, volume_.Run({"rm", In("a")}).status);
    EXPECT_FALSE(Exists(In("._a")));
    EXPECT_FALSE(Exists(MetadataPaths(In("a")).stream));
}

TEST_P(SidecarTest, ItIsRemovedWithItsObject) {
    if (GetParam() == 7) GTEST_SKIP() << "there it is a file like any other";
    WriteFile(In("._a"), apple_double_);
    EXPECT_THAT(volume_.Run({"rm", In("a")}), Succeeded());
    EXPECT_FALSE(Exists(In("._a")));
    ExpectNoneOfANewFile();
}

TEST_P(SidecarTest, WhatIsNoneStays) {
    Bytes version1 = apple_double_;
    version1[5] = 1;
    std::vector<Bytes> others = {Ascii("text"), {}, version1};
    if (GetParam() == 7) others.push_back(apple_double_);
    for (const Bytes& other : others) {
        WriteFile(In("a"), Ascii("data"));
        WriteFile(In("._a"), other);
        EXPECT_THAT(volume_.Run({"cp", In("a"), In("c")}), Succeeded());
        EXPECT_FALSE(Exists(In("._c")));
        EXPECT_THAT(volume_.Run({"mv", In("a"), In("b")}), Succeeded());
        EXPECT_TRUE(Exists(In("._a")));
        EXPECT_FALSE(Exists(In("._b")));
        WriteFile(In("a"), Ascii("data"));
        EXPECT_THAT(volume_.Run({"rm", In("a")}), Succeeded());
        EXPECT_TRUE(Exists(In("._a")));
        EXPECT_EQ(other, BytesIn(In("._a")));
        // Named, it is copied, moved and removed.
        EXPECT_THAT(volume_.Run({"cp", In("._a"), In("named")}), Succeeded());
        EXPECT_EQ(other, BytesIn(In("named")));
        EXPECT_THAT(volume_.Run({"mv", In("._a"), In("other/._a")}), Succeeded());
        EXPECT_EQ(other, BytesIn(In("other/._a")));
        EXPECT_THAT(volume_.Run({"rm", In("other/._a")}), Succeeded());
        EXPECT_FALSE(Exists(In("other/._a")));
    }
}

TEST_P(SidecarTest, OneWithoutAnObjectIsCopiedMovedAndRemovedByItsName) {
    ASSERT_EQ(0, unlink(In("a").c_str()));
    WriteFile(In("._a"), apple_double_);
    EXPECT_THAT(volume_.Run({"cp", In("._a"), In("other/._a")}), Succeeded());
    EXPECT_EQ(apple_double_, BytesIn(In("other/._a")));
    EXPECT_THAT(volume_.Run({"mv", In("._a"), In("._c")}), Succeeded());
    EXPECT_EQ(apple_double_, BytesIn(In("._c")));
    EXPECT_THAT(volume_.Run({"rm", In("._c")}), Succeeded());
    EXPECT_FALSE(Exists(In("._c")));
}

// ---- Many, and odd ------------------------------------------------------------------------------

class EaVolumeTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume_.path());
    }
    const Volume volume_{GetParam(), FastDirectory()};
};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, EaVolumeTest, ::testing::ValuesIn(Types({1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(EaVolumeTest, ColonsInNamesDoNotLeadAnUpgradeElsewhere) {
    const std::string top = volume_.path() + "/c:d";
    MakeDir(top);
    MakeDir(top + "/e:f");
    const std::vector<std::string> objects = {top + "/plain", top + "/a:b", top + "/e:f/x",
                                              top + "/e:f/y:z"};
    for (const std::string& object : objects) {
        WriteFile(object, Ascii("data"));
        PutLegacy(object, "user.color", Ascii(object));
        PutLegacy(object, "MAVO:Resource", PlainAppleDouble(kFinderInfo, kFork));
        PutLegacy(object, "MAVO:Icon", Pattern(100, 1));
        PutLegacy(object, "MAVOplain", Pattern(100, 2));
        PutLegacy(object, "k:l", Pattern(100, 3));
    }
    const std::string apple_double = top + "/e:f/m:n";
    WriteFile(apple_double, Ascii("data"));
    PutAppleDouble(apple_double, MacSidecar({{{"user.a", Ascii("1")}}, kFinderInfo, kFork}).bytes);

    const ToolResult result = volume_.Run({"upgrade", "-r", volume_.path()});
    EXPECT_EQ(0, result.status) << result.err;
    for (const std::string& object : objects) {
        SCOPED_TRACE(object);
        EXPECT_EQ(Ascii("data"), BytesIn(object));
        const Holdings found = HoldingsOf(GetParam(), object);
        EXPECT_TRUE(found.HasAttribute({"user.color", Ascii(object)}));
        EXPECT_TRUE(found.HasFinderInfo(kFinderInfo));
        EXPECT_TRUE(found.HasFork(kFork));
        for (const auto& [name, bytes] :
             std::map<std::string, Bytes>{{"MAVO:Icon", Pattern(100, 1)},
                                          {"MAVOplain", Pattern(100, 2)},
                                          {"k:l", Pattern(100, 3)}}) {
            EXPECT_TRUE(OtherPart(name, bytes).there(GetParam(), found)) << name;
        }
    }
    EXPECT_TRUE(HoldingsOf(GetParam(), apple_double).HasAttribute({"user.a", Ascii("1")}));
    for (const std::string& directory : {volume_.path(), top, top + "/e:f"}) {
        for (const std::string& name : NamesIn(directory)) {
            EXPECT_THAT(name, ::testing::AnyOf("@eaDir", "file.txt", "c:d", "e:f", "plain", "a:b",
                                               "x", "y:z", "m:n"));
        }
    }
}

// More objects than a process may have open files.
TEST_P(EaVolumeTest, ThousandObjectsWithRecordsNeedFewOpenFiles) {
    const int count = Tested().emulated() ? 300 : 1100;
    const std::string top = volume_.path() + "/top";
    MakeDir(top);
    const auto name_of = [](int number) { return "object" + std::to_string(number); };
    const auto finder_info_of = [](int number) {
        return Pattern(32, static_cast<std::uint8_t>(number % 250));
    };
    for (int number = 0; number < count; ++number) {
        const std::string object = top + '/' + name_of(number);
        WriteFile(object, {});
        if (GetParam() == 2) {
            SetFileAttribute(object, kRecordAttribute,
                             RecordOf({.finder_info = finder_info_of(number)}));
        } else {
            PutResource(object, ResourceFileOf({{kFinderInfoEntry, finder_info_of(number)},
                                                {kCommentEntry, Ascii("comment")}}));
        }
    }
    const ToolResult copied =
        volume_.Run({"cp", "-r", top, volume_.path() + "/copy"}, {}, {.open_files = 256});
    EXPECT_EQ(0, copied.status) << copied.err.substr(0, 500);
    int missing = 0;
    for (int number = 0; number < count; ++number) {
        const std::string object = volume_.path() + "/copy/" + name_of(number);
        const auto record = ReadMacFile(GetParam() == 2 ? FileAttribute(object, kRecordAttribute)
                                                        : BytesIn(MetadataPaths(object).resource));
        missing += record && record->finder_info == finder_info_of(number) ? 0 : 1;
    }
    EXPECT_EQ(0, missing);

    const ToolResult locked =
        volume_.Run({"lock", "-r", volume_.path() + "/copy"}, {}, {.open_files = 256});
    EXPECT_EQ(0, locked.status) << locked.err.substr(0, 500);
    int unlocked = 0;
    for (int number = 0; number < count; ++number) {
        const std::string object = volume_.path() + "/copy/" + name_of(number);
        unlocked += (MarksOf(object) & kLockedMark) != 0 ? 0 : 1;
    }
    EXPECT_EQ(0, unlocked);
}

}  // namespace
}  // namespace mavoea::test

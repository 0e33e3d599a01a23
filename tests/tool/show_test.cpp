// mavoea show: what an object has, in words and as JSON, from bytes that were written by hand; and
// that nothing it is given makes it fail.

#include <gtest/gtest.h>
#include <sys/xattr.h>

#include <filesystem>

#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using nlohmann::json;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kFork = "com.apple.ResourceFork";
const std::string kComment = "com.apple.metadata:kMDItemFinderComment";
const std::string kTags = "com.apple.metadata:_kMDItemUserTags";
const std::string kWhereFrom = "com.apple.metadata:kMDItemWhereFroms";
const std::string kQuarantine = "com.apple.quarantine";
const std::string kOther = "com.apple.metadata:kMDItemOther";

constexpr const char* kNoList = "it is no property list";
constexpr const char* kDamaged = "its property list is damaged";
constexpr const char* kTooMuch = "its property list is too deep or too large";

// "Grüße", in UTF-16.
Bytes CommentList() {
    return Hex(
        "'bplist00' 65 0047 0072 00FC 00DF 0065"  // 8: 5 letters
        "08"                                      // 19: where the object is
        "00*6 01 01 00*7 01 00*8 00*7 13");
}

// "Home", "Work" in blue, and "Red" in red.
Bytes TagsList() {
    return Hex(
        "'bplist00' A3 01 02 03"                      // 8: an array
        "54 'Home' 56 'Work' 0A '4' 55 'Red' 0A '6'"  // 12, 17, 24
        "08 0C 11 18"                                 // 30: where the objects are
        "00*6 01 01 00*7 04 00*8 00*7 1E");
}

// One address of 21 letters.
Bytes WhereFromList() {
    return Hex(
        "'bplist00' A1 01 5F 10 15 'https://example.com/a' 08 0A"
        "00*6 01 01 00*7 02 00*8 00*7 22");
}

// A list of objects that have been written; the first is the root. Numbers and places of objects
// have two bytes.
Bytes ListOf(const std::vector<Bytes>& objects) {
    Bytes list = Ascii("bplist00");
    Bytes places;
    const auto number = [](std::size_t value) {
        return Bytes{static_cast<std::uint8_t>(value >> 8), static_cast<std::uint8_t>(value)};
    };
    for (const Bytes& object : objects) {
        places = places + number(list.size());
        list = list + object;
    }
    const std::size_t table = list.size();
    return list + places + Hex("00*6 02 02 00*6") + number(objects.size()) + Hex("00*8 00*6") +
           number(table);
}

Bytes RefTo(std::size_t number) {
    return {static_cast<std::uint8_t>(number >> 8), static_cast<std::uint8_t>(number)};
}

class ShowCommandTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        if (GetParam() != 0) MAVOEA_SKIP_UNLESS_ROOT();
        volume_ = std::make_unique<Volume>(GetParam());
    }

    ToolResult Show(const std::string& path) const { return volume_->Run({"show", path}); }
    ToolResult Show() const { return Show(volume_->object()); }
    json Described() const {
        const ToolResult result = volume_->Run({"--json", "show", volume_->object()});
        EXPECT_THAT(result, Succeeded());
        return result.json();
    }
    void Set(const std::string& name, const Bytes& value) const {
        ASSERT_THAT(volume_->Set(name, value), Succeeded()) << name;
    }
    // Lines of `text` that are about marks, which services set, left out.
    static std::string WithoutMarks(const std::string& text) {
        std::string left;
        for (std::size_t at = 0; at < text.size();) {
            const std::size_t end = text.find('\n', at) + 1;
            if (!text.substr(at, end - at).starts_with("marks")) left += text.substr(at, end - at);
            at = end;
        }
        return left;
    }

    std::unique_ptr<Volume> volume_;
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, ShowCommandTest, ::testing::ValuesIn(Types({0, 1, 2})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

// ---- Finder info --------------------------------------------------------------------------------

TEST_P(ShowCommandTest, AFilesFinderInfoIsShownInWords) {
    Set(kFinderInfo, Hex("'TEXT' 'ttxt' 48 4C 00 14 FF F0 00*8 00*2 80 01 00*2 00 00 00 02"));
    EXPECT_THAT(Show(), Succeeded());
    EXPECT_EQ(
        "type            TEXT\n"
        "creator         ttxt\n"
        "label           red\n"
        "flags           shared, stationery, invisible\n"
        "location        -16 across, 20 down\n"
        "extended flags  0x8001\n"
        "put away to     folder 2\n",
        WithoutMarks(Show().out));
    const json info = Described().at("finderInfo");
    EXPECT_EQ("TEXT", info.at("type"));
    EXPECT_EQ("74747874", info.at("creatorHex"));
    EXPECT_EQ("red", info.at("label"));
    EXPECT_EQ(6, info.at("labelNumber"));
    EXPECT_EQ((json{"shared", "stationery", "invisible"}), info.at("flags"));
    EXPECT_EQ(0x484C, info.at("flagBits"));
    EXPECT_EQ((json{{"across", -16}, {"down", 20}}), info.at("location"));
    EXPECT_EQ("5445585474747874484c0014fff0" + std::string(20, '0') + "80010000" + "00000002",
              info.at("hex"));
}

TEST_P(ShowCommandTest, EachLabelAndFlagHasItsName) {
    const std::vector<std::pair<std::uint16_t, std::string>> words = {
        {0x0001, "flags  on-desk\n"},    {0x0002, "label  grey\n"},
        {0x0004, "label  green\n"},      {0x0006, "label  purple\n"},
        {0x0008, "label  blue\n"},       {0x000A, "label  yellow\n"},
        {0x000C, "label  red\n"},        {0x000E, "label  orange\n"},
        {0x0040, "flags  shared\n"},     {0x0080, "flags  no-inits\n"},
        {0x0100, "flags  inited\n"},     {0x0400, "flags  custom-icon\n"},
        {0x0800, "flags  stationery\n"}, {0x1000, "flags  name-locked\n"},
        {0x2000, "flags  has-bundle\n"}, {0x4000, "flags  invisible\n"},
        {0x8000, "flags  alias\n"},
    };
    for (const auto& [bits, line] : words) {
        Bytes info(32);
        info[8] = static_cast<std::uint8_t>(bits >> 8);
        info[9] = static_cast<std::uint8_t>(bits);
        Set(kFinderInfo, info);
        EXPECT_EQ(line, WithoutMarks(Show().out));
    }
}

TEST_P(ShowCommandTest, TypesOfOtherBytesAreEscapedAndMacOsRoman) {
    Set(kFinderInfo, Hex("00 5C 8A 0A 'A' 7F 20 CA") + Bytes(24));
    EXPECT_EQ("type     \\x00\\\\ä\\x0A\ncreator  A\\x7F \u00A0\n", WithoutMarks(Show().out));
    EXPECT_EQ("005c8a0a", Described().at("finderInfo").at("typeHex"));
}

TEST_P(ShowCommandTest, AFolderHasAWindowAndNoType) {
    const std::string folder = volume_->path() + "/folder";
    std::filesystem::create_directory(folder);
    const Bytes info = Hex("0028 FFC4 0190 0258 0402 FFFF 0064 0100 0005 FFFA 00*4 0080 00*6");
    ASSERT_THAT(volume_->Run({"set", folder, kFinderInfo}, {info.begin(), info.end()}),
                Succeeded());
    EXPECT_EQ(
        "window          -60 across, 40 down to 600 across, 400 down\n"
        "scrolled        -6 across, 5 down\n"
        "label           grey\n"
        "flags           custom-icon\n"
        "location        100 across, -1 down\n"
        "extended flags  0x0080\n",
        WithoutMarks(Show(folder).out));
    const json shown = volume_->Run({"--json", "show", folder}).json();
    EXPECT_EQ("directory", shown.at("kind"));
    EXPECT_EQ(R"({"from":{"across":-60,"down":40},"to":{"across":600,"down":400}})",
              shown.at("finderInfo").at("window").dump());
    EXPECT_FALSE(shown.at("finderInfo").contains("type"));
}

// ---- What Macs keep in attributes ---------------------------------------------------------------

TEST_P(ShowCommandTest, WhatMacsKeepInAttributesIsDecoded) {
    Set(kComment, CommentList());
    Set(kTags, TagsList());
    Set(kWhereFrom, WhereFromList());
    Set(kQuarantine, Ascii("0083;5f3e1a2b;Safari;01234567-89AB"));
    Set(kFork, Ascii("abc"));
    Set("com.example.colour", Ascii("b"));
    EXPECT_EQ(
        "comment             \"Grüße\"\n"
        "tags                \"Home\", \"Work\" (blue), \"Red\" (red)\n"
        "where from          https://example.com/a\n"
        "quarantine          flags 0x0083, 2020-08-20T06:37:31Z, Safari, 01234567-89AB\n"
        "resource fork       3 bytes\n"
        "com.example.colour  1 byte\n",
        WithoutMarks(Show().out));
    const json shown = Described();
    EXPECT_EQ(volume_->object(), shown.at("path"));
    EXPECT_EQ("file", shown.at("kind"));
    EXPECT_EQ("Grüße", shown.at("comment"));
    EXPECT_EQ(R"([{"colour":"none","colourNumber":0,"name":"Home"},)"
              R"({"colour":"blue","colourNumber":4,"name":"Work"},)"
              R"({"colour":"red","colourNumber":6,"name":"Red"}])",
              shown.at("tags").dump());
    EXPECT_EQ(json::array({"https://example.com/a"}), shown.at("whereFrom"));
    EXPECT_EQ(R"({"agent":"Safari","flags":131,"id":"01234567-89AB",)"
              R"("time":"2020-08-20T06:37:31Z"})",
              shown.at("quarantine").dump());
    EXPECT_EQ(3, shown.at("resourceFork").at("size"));
    EXPECT_EQ(R"([{"name":"com.example.colour","size":1}])", shown.at("attributes").dump());
}

TEST_P(ShowCommandTest, OtherPropertyListsAreShownAsTheyAre) {
    // {"k": [1, -1, 2.5, true, data, 2001-01-01 and a day, uid]}, an integer of 8 bytes has a sign.
    Set(kOther, ListOf({Bytes{0xD1} + RefTo(1) + RefTo(2), Hex("51 'k'"),
                        Bytes{0xA7} + RefTo(3) + RefTo(4) + RefTo(5) + RefTo(6) + RefTo(7) +
                            RefTo(8) + RefTo(9),
                        Hex("10 01"), Hex("13 FF*8"), Hex("23 4004000000000000"), Hex("09"),
                        Hex("42 00 FF"), Hex("33 40F5180000000000"), Hex("80 07")}));
    const std::string value = R"({"k":[1,-1,2.5,true,"00ff","2001-01-02T00:00:00Z",{"uid":7}]})";
    EXPECT_EQ(kOther + "  " + value + "\n", WithoutMarks(Show().out));
    EXPECT_EQ(json::parse(value), Described().at("attributes").at(0).at("value"));

    Set(kOther, Ascii("<?xml version=\"1.0\"?><plist version=\"1.0\"><array><string>a &lt; b"
                      "</string><integer>-5</integer><dict/></array></plist>"));
    EXPECT_EQ(kOther + "  [\"a < b\",-5,{}]\n", WithoutMarks(Show().out));
}

// ---- What is none of that -----------------------------------------------------------------------

TEST_P(ShowCommandTest, WhatCannotBeDecodedIsShownByItsSizeAndSaidToBe) {
    std::vector<Bytes> deep;
    for (std::size_t i = 0; i < 13000; ++i) deep.push_back(Bytes{0xA1} + RefTo(i + 1));
    deep.push_back(Hex("51 'x'"));
    std::vector<Bytes> doubling;
    for (std::size_t i = 0; i < 40; ++i) {
        doubling.push_back(Bytes{0xA2} + RefTo(i + 1) + RefTo(i + 1));
    }
    doubling.push_back(Hex("51 'x'"));
    std::vector<Bytes> long_again = {Hex("AF 11") + RefTo(1000)};
    for (int i = 0; i < 1000; ++i) long_again.front() = long_again.front() + RefTo(1);
    long_again.push_back(Hex("5F 11 EA 60 'x'*60000"));
    std::string nested = "<plist>";
    for (int i = 0; i < 9000; ++i) nested += "<array>";

    struct Case {
        std::string name;
        Bytes value;
        std::string reason;
    };
    const std::vector<Case> cases = {
        {kOther, {}, kNoList},
        {kOther, Ascii("plain"), kNoList},
        {kOther, Ascii("bplist00"), kDamaged},
        {kOther, Ascii("bplist01") + Bytes(32), kNoList},
        {kOther, ListOf(deep), kTooMuch},
        {kOther, ListOf(doubling), kTooMuch},
        {kOther, ListOf(long_again), kTooMuch},
        {kOther, ListOf({Bytes{0xA1} + RefTo(1), Bytes{0xA1} + RefTo(0)}), kTooMuch},
        {kOther, ListOf({Bytes{0xA1} + RefTo(1)}), kDamaged},
        {kOther, ListOf({Hex("53 'a' 00 'b'")}),
         "its property list holds something of another kind"},
        {kOther, ListOf({Hex("14 00*16")}), "its property list holds something of another kind"},
        {kOther, ListOf({Hex("33 7FF0 00*6")}),
         "its property list holds something of another kind"},
        {kOther, ListOf({Hex("5F 13 FF*8")}), kDamaged},
        {kOther, Ascii(nested), kTooMuch},
        {kOther, Ascii("<plist><array>"), kDamaged},
        {kOther, Ascii("<?xml"), kDamaged},
        {kOther, Ascii("bplist00") + Bytes(65600), "it has more than 65536 bytes"},
        {kComment, TagsList(), "it is no text"},
        {kTags, CommentList(), "it is no array of texts"},
        {kTags, ListOf({Bytes{0xA1} + RefTo(1), Hex("09")}), "it is no array of texts"},
        {kWhereFrom, Ascii("xx"), kNoList},
        {kQuarantine, Ascii("no digits"), "it is no quarantine of this kind"},
        {kQuarantine, Ascii("0;ffffffffffffffff;a;b"), "it is no quarantine of this kind"},
    };
    for (const Case& one : cases) {
        SCOPED_TRACE(one.name + " " + one.reason);
        Set(one.name, one.value);
        const ToolResult shown = Show();
        EXPECT_THAT(shown, Succeeded());
        EXPECT_EQ(one.name + "  " + std::to_string(one.value.size()) +
                      " bytes, not decoded: " + one.reason + "\n",
                  WithoutMarks(shown.out));
        const json entry = Described().at("attributes").at(0);
        EXPECT_EQ(one.reason, entry.at("undecoded"));
        EXPECT_EQ(one.value.size(), entry.at("size"));
        EXPECT_FALSE(entry.contains("value"));
        ASSERT_THAT(volume_->Remove(one.name), Succeeded());
    }
}

// All lengths of a list, and each of its bytes with some other values, in one go.
TEST(ShownListTest, NoDamagedOneEndsIt) {
    const Volume volume(0);
    const std::string xml =
        "<?xml version=\"1.0\"?><!DOCTYPE plist><plist version=\"1.0\"><dict><key>a</key><array>"
        "<string>x&#228;<![CDATA[y]]></string><data>AAEC</data><date>2020-01-02T03:04:05Z</date>"
        "<real>1.5</real><true/><integer>3</integer><!-- c --></array></dict></plist>";
    for (const Bytes& whole : {TagsList(), CommentList(), WhereFromList(), Ascii(xml)}) {
        StreamImage image;
        const auto add = [&](const Bytes& value) {
            const std::string number = std::to_string(image.attributes.size());
            image.attributes.push_back({"com.apple.metadata:" + number, value});
        };
        for (std::size_t size = 0; size < whole.size(); ++size) {
            add(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)));
        }
        for (std::size_t at = 0; at < whole.size(); ++at) {
            for (const int value : {0x00, 0x01, 0x0F, 0x1F, 0x7F, 0xA0, 0xD2, 0xFF, 0x3C, 0x26}) {
                Bytes damaged = whole;
                damaged[at] = static_cast<std::uint8_t>(value);
                add(damaged);
            }
        }
        WriteFile(volume.apple_double(), image.Build());
        const ToolResult shown = volume.Run({"show", volume.object()});
        EXPECT_EQ(0, shown.status) << shown.err;
        EXPECT_EQ(image.attributes.size(), std::count(shown.out.begin(), shown.out.end(), '\n'));
        EXPECT_EQ(0, volume.Run({"--json", "show", volume.object()}).status);
    }
}

TEST_P(ShowCommandTest, ADamagedMetadataFileIsAFailure) {
    Set("com.example.colour", Ascii("blue"));
    Bytes file = ReadFile(volume_->attribute_file());
    file.resize(file.size() - 2);
    WriteFile(volume_->attribute_file(), file);
    const ToolResult shown = Show();
    EXPECT_EQ(2, shown.status);
    EXPECT_THAT(shown.err, HasSubstr(volume_->attribute_file()));
}

// ---- Several objects ----------------------------------------------------------------------------

TEST_P(ShowCommandTest, SeveralObjectsHaveTheirPathsAboveThem) {
    const std::string other = volume_->path() + "/other";
    WriteFile(other, Ascii("data"));
    Set("com.example.colour", Ascii("blue"));
    EXPECT_EQ("", WithoutMarks(Show(other).out));
    EXPECT_EQ(volume_->object() + ":\ncom.example.colour  4 bytes\n\n" + other + ":\n",
              WithoutMarks(volume_->Run({"show", volume_->object(), other}).out));
    EXPECT_EQ(volume_->object() + ":\ncom.example.colour  4 bytes\n",
              WithoutMarks(volume_->Run({"show", "-r", volume_->path()}).out));
    const ToolResult missing = volume_->Run({"show", volume_->path() + "/none", other});
    EXPECT_EQ(1, missing.status);
}

// ---- Records ------------------------------------------------------------------------------------

class ShownRecordTest : public ::testing::Test {
 protected:
    void SetUp() override { MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path()); }

    // netatalk's record: comment at 154, dates at 354, Finder info at 122, AFP info at 370.
    static Bytes Record(const Bytes& comment, const Bytes& dates) {
        Bytes record =
            Hex("00051607 00020000 00*16 0008"
                "00000004 0000009A 00000000"
                "00000008 00000162 00000010"
                "00000009 0000007A 00000020"
                "0000000E 00000172 00000004"
                "80444556 00000176 00000000"
                "80494E4F 0000017E 00000000"
                "8053594E 00000186 00000000"
                "8053567E 0000018E 00000000");
        record.resize(402);
        record[26 + 11] = static_cast<std::uint8_t>(comment.size());
        std::copy(comment.begin(), comment.end(), record.begin() + 154);
        std::copy(dates.begin(), dates.end(), record.begin() + 354);
        return record;
    }

    void Put(const std::string& name, const Bytes& value) const {
        ASSERT_EQ(0, setxattr(file().c_str(), name.c_str(), value.data(), value.size(), 0));
    }
    ToolResult Show(const std::string& type) const {
        return RunTool({"--volume", dir_.path() + "=" + type, "show", file()});
    }
    std::string file() const { return dir_ / "a"; }

    TempDir dir_;
};

TEST_F(ShownRecordTest, CommentAndDatesOfARecordAreShown) {
    WriteFile(file(), {});
    // "Stra", a sharp s of Mac OS Roman, "e".
    Put("user.org.netatalk.Metadata",
        Record(Hex("'Stra' A7 'e'"), Hex("2DC4C818 80000000 FFFFFFFF 80000000")));
    EXPECT_THAT(Show("netatalk"), Succeeded());
    EXPECT_EQ(
        "comment    \"Straße\"\n"
        "created    2024-05-01T09:30:00Z\n"
        "backed up  1999-12-31T23:59:59Z\n",
        Show("netatalk").out);
    Put("user." + kComment, CommentList());
    EXPECT_THAT(Show("netatalk").out,
                HasSubstr("comment      \"Grüße\"\nAFP comment  \"Straße\"\n"));
}

TEST_F(ShownRecordTest, TheTimeThatSambaKeepsIsShown) {
    WriteFile(file(), {});
    Put("user.DOSATTRIB", Hex("00000500 05000000 11000000 22000000 28DA02221379DD01"));
    EXPECT_EQ(
        "created for SMB  2026-11-20T17:18:17.2934696Z\n"
        "marks            hidden, archive\n",
        Show("samba").out);
}

}  // namespace
}  // namespace mavoea::test

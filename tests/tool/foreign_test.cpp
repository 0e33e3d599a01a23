// Places of other programs: what Samba, netatalk and those that copy attributes keep, byte for
// byte.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <optional>
#include <string>

#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::AllOf;
using ::testing::AnyOf;
using ::testing::HasSubstr;
using ::testing::Not;

const std::string kFinderInfoName = "com.apple.FinderInfo";
const std::string kForkName = "com.apple.ResourceFork";
const std::string kColour = "com.example.colour";
const std::string kLocked = "mavoea.locked";

const std::string kRecord = "user.org.netatalk.Metadata";
const std::string kAfpInfo = "user.DosStream.AFP_AfpInfo:$DATA";
const std::string kAfpResource = "user.DosStream.AFP_Resource:$DATA";
const std::string kColourStream = "user.DosStream.com.example.colour:$DATA";
const std::string kDosAttributes = "user.DOSATTRIB";

// Colours and other names that mean something else in every place.
Bytes FinderInfo(std::uint8_t label = 1) {
    Bytes info = Ascii("TEXTttxt");
    info.resize(32);
    info[9] = label;
    return info;
}

Bytes FromHex(const std::string& digits) {
    Bytes bytes;
    for (std::size_t i = 0; i + 1 < digits.size(); i += 2) {
        bytes.push_back(static_cast<std::uint8_t>(std::stoi(digits.substr(i, 2), nullptr, 16)));
    }
    return bytes;
}

Bytes operator+(Bytes one, const Bytes& other) {
    one.insert(one.end(), other.begin(), other.end());
    return one;
}

void Put(Bytes& into, std::size_t at, const Bytes& bytes) {
    std::copy(bytes.begin(), bytes.end(), into.begin() + static_cast<std::ptrdiff_t>(at));
}

Bytes Stretch(const Bytes& bytes, std::size_t at, std::size_t size) {
    const auto begin = bytes.begin() + static_cast<std::ptrdiff_t>(at);
    return {begin, begin + static_cast<std::ptrdiff_t>(size)};
}

// A record as Samba writes it: comment at 154, dates at 354, Finder info at 122, AFP info at 370.
Bytes Record(const Bytes& finder_info, const std::string& comment = {}, std::uint16_t word = 0) {
    Bytes record = FromHex(
        "0005160700020000000000000000000000000000000000000008"
        "000000040000009a00000000"
        "000000080000016200000010"
        "000000090000007a00000020"
        "0000000e0000017200000004"
        "804445560000017600000000"
        "80494e4f0000017e00000000"
        "8053594e0000018600000000"
        "8053567e0000018e00000000");
    record.resize(402);
    Put(record, 122, finder_info);
    Put(record, 154, Ascii(comment));
    record[26 + 11] = static_cast<std::uint8_t>(comment.size());
    for (std::size_t at = 354; at < 370; at += 4) record[at] = 0x80;
    record[372] = static_cast<std::uint8_t>(word >> 8);
    record[373] = static_cast<std::uint8_t>(word);
    return record;
}

// The same without dates: an unknown time of creation is one in 2068 to Samba.
Bytes WithoutDates(Bytes record) {
    record[26 + 12 + 11] = 0;
    Put(record, 354, Bytes(16));
    return record;
}

Bytes AfpInfo(const Bytes& finder_info) {
    Bytes info = FromHex("41465000000001000000000080000000");
    info = info + finder_info;
    info.resize(60);
    return info;
}

// A "._" file as Samba and netatalk have it.
Bytes ForkFile(const std::string& fork) {
    Bytes file =
        FromHex("0005160700020000") + Ascii("Netatalk        ") + FromHex("00020000000200000052");
    const auto size = static_cast<std::uint8_t>(fork.size());
    file = file + Bytes{0, 0, 0, size} + FromHex("000000090000003200000020");
    file.resize(82);
    return file + Ascii(fork);
}

// DOS attributes of 24 bytes, with a time of creation.
Bytes Dos(std::uint8_t attributes) {
    Bytes value = FromHex(
        "00000500050000001100000000000000"
        "28da02221379dd01");
    value[12] = attributes;
    return value;
}

std::optional<Bytes> Attribute(const std::string& path, const std::string& name) {
    Bytes value(70000);
    const ssize_t size = lgetxattr(path.c_str(), name.c_str(), value.data(), value.size());
    if (size < 0) return std::nullopt;
    value.resize(static_cast<std::size_t>(size));
    return value;
}

void SetAttribute(const std::string& path, const std::string& name, const Bytes& value) {
    ASSERT_EQ(0, lsetxattr(path.c_str(), name.c_str(), value.data(), value.size(), 0)) << name;
}

// All that an object has, by name.
std::map<std::string, Bytes> Attributes(const std::string& path) {
    std::string list(4096, '\0');
    const ssize_t size = llistxattr(path.c_str(), list.data(), list.size());
    std::map<std::string, Bytes> all;
    for (const char* name = list.data(); name < list.data() + std::max<ssize_t>(size, 0);
         name += all.rbegin()->first.empty() ? 1 : std::string(name).size() + 1) {
        all[name] = *Attribute(path, name);
    }
    return all;
}

std::vector<std::string> Names(const std::string& directory) {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(directory)) {
        names.push_back(entry.path().filename());
    }
    std::sort(names.begin(), names.end());
    return names;
}

// A directory of a dialect, with an object in it.
class Share {
 public:
    explicit Share(std::string type) : type_(std::move(type)) { WriteFile(file(), Ascii("data")); }

    const std::string& path() const { return dir_.path(); }
    std::string file() const { return dir_ / "a"; }
    std::string beside() const { return dir_ / "._a"; }

    ToolResult Run(Arguments arguments, const std::string& input = {}) const {
        arguments.insert(arguments.begin(), {"--volume", path() + '=' + type_});
        return RunTool(arguments, input);
    }
    ToolResult Set(const std::string& name, const Bytes& value) const {
        return Run({"set", file(), name}, std::string(value.begin(), value.end()));
    }
    Bytes Get(const std::string& name) const {
        const ToolResult result = Run({"get", file(), name});
        EXPECT_THAT(result, Succeeded()) << name;
        return result.bytes();
    }
    bool Has(const std::string& name) const { return Run({"get", file(), name}).status == 0; }

 private:
    TempDir dir_;
    std::string type_;
};

class ForeignTest : public ::testing::Test {
 protected:
    void SetUp() override { MAVOEA_SKIP_WITHOUT_ATTRIBUTES(samba_.path()); }

    Share samba_{"samba"};
    Share stream_{"samba-stream"};
    Share all_streams_{"samba-all-streams"};
    Share netatalk_{"netatalk"};
    Share netatalk_samba_{"netatalk-samba"};
    Share linux_{"linux"};
};

// ---- What is written ----------------------------------------------------------------------------

TEST_F(ForeignTest, WhatIsSetLiesWhereItsProgramLooksForIt) {
    struct Case {
        const Share& share;
        std::map<std::string, Bytes> attributes;
        bool beside;
    };
    const Bytes red = Ascii("red");
    const Case cases[] = {
        {samba_,
         {{kColourStream, red + Bytes{0}}, {kRecord, WithoutDates(Record(FinderInfo()))}},
         true},
        {stream_,
         {{kColourStream, red + Bytes{0}}, {kAfpInfo, AfpInfo(FinderInfo()) + Bytes{0}}},
         true},
        {all_streams_,
         {{kColourStream, red + Bytes{0}},
          {kAfpInfo, AfpInfo(FinderInfo()) + Bytes{0}},
          {kAfpResource, Ascii("fork") + Bytes{0}}},
         false},
        {netatalk_, {{"user." + kColour, red}, {kRecord, Record(FinderInfo())}}, true},
        {netatalk_samba_,
         {{"user." + kColour, red + Bytes{0}}, {kRecord, Record(FinderInfo())}},
         true},
        {linux_,
         {{"user." + kColour, red},
          {"user." + kFinderInfoName, FinderInfo()},
          {"user." + kForkName, Ascii("fork")}},
         false},
    };
    for (const Case& one : cases) {
        SCOPED_TRACE(one.share.path());
        const Share& share = one.share;
        EXPECT_THAT(share.Set(kColour, red), Succeeded());
        EXPECT_THAT(share.Set(kFinderInfoName, FinderInfo()), Succeeded());
        EXPECT_THAT(share.Set(kForkName, Ascii("fork")), Succeeded());
        EXPECT_EQ(one.attributes, Attributes(share.file()));
        EXPECT_EQ(one.beside, Exists(share.beside()));
        if (one.beside) {
            EXPECT_EQ(ForkFile("fork"), ReadFile(share.beside()));
        }

        EXPECT_EQ(red, share.Get(kColour));
        EXPECT_EQ(FinderInfo(), share.Get(kFinderInfoName));
        EXPECT_EQ(Ascii("fork"), share.Get(kForkName));
        EXPECT_EQ(kColour + '\n' + kFinderInfoName + '\n' + kForkName + '\n',
                  share.Run({"list", share.file()}).out);

        for (const std::string& name : {kColour, kFinderInfoName, kForkName}) {
            EXPECT_THAT(share.Run({"remove", share.file(), name}), Succeeded());
            EXPECT_EQ(1, share.Run({"remove", share.file(), name}).status);
        }
        EXPECT_EQ("", share.Run({"list", share.file()}).out);
    }
}

TEST_F(ForeignTest, ACharacterThatSmbForbidsIsWrittenAsClientsDo) {
    EXPECT_THAT(samba_.Set("com.example:1", Ascii("x")), Succeeded());
    EXPECT_EQ(Ascii("x") + Bytes{0}, Attribute(samba_.file(),
                                               "user.DosStream.com.example\xEF\x80\xA2"
                                               "1:$DATA"));
    // Samba itself writes the other when it takes a Mac's file over.
    SetAttribute(samba_.file(), "user.DosStream.com.example:2:$DATA", Ascii("y") + Bytes{0});
    EXPECT_EQ(Ascii("y"), samba_.Get("com.example:2"));
    EXPECT_THAT(samba_.Set("com.example:2", Ascii("z")), Succeeded());
    EXPECT_EQ(std::nullopt, Attribute(samba_.file(), "user.DosStream.com.example:2:$DATA"));
    EXPECT_EQ(Ascii("z"), samba_.Get("com.example:2"));
}

TEST_F(ForeignTest, ARecordThatIsThereKeepsItsOtherEntries) {
    for (const Share* share : {&samba_, &netatalk_, &netatalk_samba_}) {
        Bytes record = Record(FinderInfo(2), "comment", 0x0400);
        Put(record, 26 + 7 * 12 + 8, {0, 0, 0, 4});  // netatalk's own id
        Put(record, 398, Ascii("cnid"));
        SetAttribute(share->file(), kRecord, record);
        EXPECT_THAT(share->Set(kFinderInfoName, FinderInfo(7)), Succeeded());
        Put(record, 122, FinderInfo(7));
        EXPECT_EQ(record, Attribute(share->file(), kRecord));
    }
}

TEST_F(ForeignTest, ARecordThatSmbdWouldRemoveIsNeverWrittenOver) {
    const Bytes sound = Record(FinderInfo());
    Bytes seven = sound;
    seven[25] = 7;
    Bytes no_offset = sound;
    Put(no_offset, 26 + 4, {0, 0, 0, 0});
    Bytes long_comment = sound;
    Put(long_comment, 26 + 8, {0, 0, 0, 201});
    Bytes short_dates = sound;
    Put(short_dates, 26 + 12 + 8, {0, 0, 0, 15});
    Bytes short_info = sound;
    Put(short_info, 26 + 24 + 8, {0, 0, 0, 31});
    for (const Bytes& record : {Bytes(sound.begin(), sound.end() - 1), sound + Bytes{0}, seven,
                                no_offset, long_comment, short_dates, short_info, Bytes{}}) {
        SetAttribute(samba_.file(), kRecord, record);
        const ToolResult result = samba_.Set(kFinderInfoName, FinderInfo(3));
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, HasSubstr("its netatalk record is damaged"));
        EXPECT_EQ(record, Attribute(samba_.file(), kRecord));
    }
}

TEST_F(ForeignTest, AValueThatHasNoRoomIsNamedWithItsSizeAndTheLimit) {
    const Bytes large(65537, 'x');
    const ToolResult result = linux_.Set(kForkName, large);
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, AllOf(HasSubstr("no room for its 65537 bytes"), HasSubstr("bytes")));
    EXPECT_FALSE(linux_.Has(kForkName));
    // With the NUL behind it, Samba's have one less.
    EXPECT_THAT(samba_.Set(kColour, Bytes(65536, 'x')).err,
                HasSubstr("no room for its 65536 bytes: a value has 65535 bytes at most;"));
}

TEST_F(ForeignTest, AnAttributeWithoutAValueIsKeptAndThatClientsDoNotSeeItIsTold) {
    const std::string note =
        ": \"" + kColour + "\" has no value, and Samba's clients do not see such attributes\n";
    ToolResult result = samba_.Set(kColour, {});
    EXPECT_EQ(0, result.status);
    EXPECT_EQ("mavoea: note: " + samba_.file() + note, result.err);
    EXPECT_EQ(Bytes{0}, Attribute(samba_.file(), kColourStream));
    EXPECT_THAT(linux_.Set(kColour, {}), Succeeded());
    EXPECT_THAT(samba_.Set(kFinderInfoName, Bytes(32)), Succeeded());

    const Share to("samba");
    const auto copy_from = [&](const Share& from, const std::string& type) {
        return RunTool({"--volume", from.path() + '=' + type, "--volume", to.path() + "=samba",
                        "cp", from.file(), to.path() + "/copy"});
    };
    EXPECT_THAT(copy_from(samba_, "samba"), Succeeded());
    result = copy_from(linux_, "linux");
    EXPECT_EQ(0, result.status);
    EXPECT_EQ("mavoea: note: " + to.path() + "/copy" + note, result.err);
    EXPECT_EQ(Bytes{0}, Attribute(to.path() + "/copy", kColourStream));
}

TEST_F(ForeignTest, ANameThatMeansSomethingElseIsRefused) {
    for (const char* const name : {"AFP_AfpInfo", "AFP_Resource", "a/b"}) {
        EXPECT_EQ(2, samba_.Set(name, Ascii("x")).status) << name;
    }
    for (const std::string name :
         {"org.netatalk.Metadata", "DOSATTRIB", "mavo.attributes", "DosStream.x:$DATA"}) {
        EXPECT_EQ(2, linux_.Set(name, Ascii("x")).status) << name;
    }
    const std::string longest(234, 'n');
    EXPECT_THAT(samba_.Set(longest, Ascii("x")), Succeeded());
    EXPECT_EQ(Ascii("x"), samba_.Get(longest));
    EXPECT_EQ(2, samba_.Set(longest + 'n', Ascii("x")).status);
    EXPECT_TRUE(Attributes(linux_.file()).empty());
}

// ---- What is read -------------------------------------------------------------------------------

TEST_F(ForeignTest, EverySpellingOfADatumIsRead) {
    SetAttribute(samba_.file(), kColourStream, Ascii("red"));  // without the NUL
    EXPECT_EQ(Ascii("red"), samba_.Get(kColour));
    SetAttribute(samba_.file(), kColourStream, Ascii("re") + Bytes{2});
    SetAttribute(samba_.file(), "user.DosStreamExt.1.com.example.colour:$DATA", Ascii("d and "));
    SetAttribute(samba_.file(), "user.DosStreamExt.2.com.example.colour:$DATA", Ascii("more"));
    EXPECT_EQ(Ascii("red and more"), samba_.Get(kColour));
    EXPECT_EQ(kColour + '\n', samba_.Run({"list", samba_.file()}).out);
    SetAttribute(samba_.file(), kAfpInfo, AfpInfo(FinderInfo(4)) + Bytes{0});
    EXPECT_EQ(FinderInfo(4), samba_.Get(kFinderInfoName));
    SetAttribute(samba_.file(), kAfpResource, Ascii("fork") + Bytes{0});
    EXPECT_EQ(Ascii("fork"), samba_.Get(kForkName));
    // The place where a fork is, is the one where it is changed.
    EXPECT_THAT(samba_.Set(kForkName, Ascii("another")), Succeeded());
    EXPECT_EQ(Ascii("another") + Bytes{0}, Attribute(samba_.file(), kAfpResource));
    EXPECT_FALSE(Exists(samba_.beside()));
    // Values that go on are gone with what they go on with.
    EXPECT_THAT(samba_.Run({"remove", samba_.file(), kColour}), Succeeded());
    EXPECT_EQ(std::nullopt,
              Attribute(samba_.file(), "user.DosStreamExt.2.com.example.colour:$DATA"));
}

TEST_F(ForeignTest, ListTellsWhereAndUnderWhatNameItLies) {
    ASSERT_THAT(samba_.Set(kColour, Ascii("red")), Succeeded());
    ASSERT_THAT(samba_.Set(kFinderInfoName, FinderInfo()), Succeeded());
    const std::string out = samba_.Run({"list", "-l", samba_.file()}).out;
    EXPECT_THAT(out, HasSubstr(kColour + "    " + samba_.file() + " (" + kColourStream + ")\n"));
    EXPECT_THAT(out, HasSubstr(kFinderInfoName + "  " + samba_.file() + " (" + kRecord + ")\n"));
    const auto json = samba_.Run({"list", "--json", samba_.file()}).json();
    EXPECT_EQ("samba", json["type"]);
    EXPECT_EQ(kColourStream, json["attributes"][0]["attribute"]);
}

TEST_F(ForeignTest, TwoSpellingsThatDifferAreBothTold) {
    ASSERT_THAT(samba_.Set(kFinderInfoName, FinderInfo(1)), Succeeded());
    SetAttribute(samba_.file(), kAfpInfo, AfpInfo(FinderInfo(2)) + Bytes{0});
    EXPECT_EQ(FinderInfo(1), samba_.Get(kFinderInfoName));
    EXPECT_THAT(samba_.Run({"list", samba_.file()}).err,
                HasSubstr("a second Finder info in " + samba_.file() + " (" + kAfpInfo + ")"));
    Share to("samba");
    const ToolResult result =
        RunTool({"--volume", samba_.path() + "=samba", "--volume", to.path() + "=samba", "cp",
                 samba_.file(), to.path() + "/b"});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("a second Finder info in"));
}

TEST_F(ForeignTest, WhatAMacHasLeftBesideAnObjectComesFirstForSamba) {
    // Finder info, an attribute and a fork, as macOS writes them.
    Bytes file = FromHex("0005160700020000") + Ascii("Mac OS X        ") +
                 FromHex("000200000009000000320000006d000000020000009f00000004");
    file = file + FinderInfo(5) + FromHex("0000") + Ascii("ATTR") + FromHex("00000000") +
           FromHex(
               "0000009f"
               "0000009c"
               "00000003") +
           Bytes(12) +
           FromHex(
               "0000"
               "0001") +
           FromHex(
               "0000009c"
               "00000003"
               "0000"
               "13") +
           Ascii("com.example.colour") + Bytes{0};
    file.resize(0x9c);
    file = file + Ascii("red") + Ascii("fork");
    WriteFile(samba_.beside(), file);
    SetAttribute(samba_.file(), kRecord, Record(FinderInfo(1)));
    EXPECT_EQ(FinderInfo(5), samba_.Get(kFinderInfoName));
    EXPECT_EQ(Ascii("red"), samba_.Get(kColour));
    EXPECT_EQ(Ascii("fork"), samba_.Get(kForkName));
    // What is set must not be taken back from there.
    EXPECT_THAT(samba_.Set(kFinderInfoName, FinderInfo(6)), Succeeded());
    EXPECT_EQ(FinderInfo(6), samba_.Get(kFinderInfoName));
    EXPECT_EQ(Record(FinderInfo(6)), Attribute(samba_.file(), kRecord));
    EXPECT_THAT(samba_.Set(kColour, Ascii("blue")), Succeeded());
    EXPECT_EQ(Ascii("blue"), samba_.Get(kColour));
    EXPECT_EQ(Ascii("fork"), samba_.Get(kForkName));
}

TEST_F(ForeignTest, WhatIsMeantIsWrittenBeforeAMacsFileMakesRoomForIt) {
    // An attribute for which attributes have no room.
    const std::string large(66000, 'x');
    Bytes file = FromHex("0005160700020000") + Ascii("Mac OS X        ") +
                 FromHex("0002000000090000003200010226000000020001025800000004");
    file = file + FinderInfo(5) + FromHex("0000") + Ascii("ATTR") + FromHex("00000000") +
           FromHex(
               "00010258"
               "00000088"
               "000101d0") +
           Bytes(12) +
           FromHex(
               "0000"
               "0001") +
           FromHex(
               "00000088"
               "000101d0"
               "0000"
               "02") +
           Ascii("x") + Bytes{0};
    file.resize(0x88);
    file = file + Ascii(large) + Ascii("fork");
    WriteFile(samba_.beside(), file);
    const std::string comment = samba_.path() + "/comment";
    Bytes head = FromHex("0005160700020000") + Bytes(16) +
                 FromHex(
                     "0001"
                     "00000004"
                     "00000026"
                     "00000007");
    WriteFile(comment, head + Ascii("comment"));
    const ToolResult result = samba_.Run({"import", comment, samba_.file()});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("no room for its 66000 bytes"));
    EXPECT_EQ(file, ReadFile(samba_.beside()));
}

TEST_F(ForeignTest, WhatIsDamagedIsToldAndTheRestIsShown) {
    ASSERT_THAT(samba_.Set(kColour, Ascii("red")), Succeeded());
    SetAttribute(samba_.file(), kRecord, Bytes(401, 0xFF));
    SetAttribute(samba_.file(), kAfpInfo, Bytes(60, 0xFF));
    SetAttribute(samba_.file(), "user.DosStream.cut:$DATA", Ascii("x") + Bytes{2});
    SetAttribute(samba_.file(), "user.DosStreamExt.1.cut:$DATA", Ascii("y"));
    const ToolResult result = samba_.Run({"list", samba_.file()});
    EXPECT_EQ(2, result.status);
    EXPECT_EQ(kColour + '\n', result.out);
    EXPECT_THAT(result.err,
                AllOf(HasSubstr("its netatalk record is damaged"),
                      HasSubstr("AFP_AfpInfo is damaged"), HasSubstr("a part of it is missing")));
}

TEST_F(ForeignTest, TheBackupTimeOfAStreamOutlivesItsFinderInfo) {
    Bytes info = AfpInfo(FinderInfo(2)) + Bytes{0};
    Put(info, 12, FromHex("11223344"));
    // The time of creation is that of the DOS attributes, 2026-11-20.
    Bytes kept = Record(Bytes(32));
    Put(kept, 354, FromHex("32933d59"));
    Put(kept, 362, FromHex("11223344"));
    const std::vector<Arguments> ways = {
        {"remove", stream_.file(), kFinderInfoName},
        {"set-info", stream_.file(), "--type", "\\x00\\x00\\x00\\x00", "--creator",
         "\\x00\\x00\\x00\\x00", "--label", "none"}};
    for (const Arguments& way : ways) {
        SCOPED_TRACE(way[0]);
        SetAttribute(stream_.file(), kDosAttributes, Dos(0x20));
        SetAttribute(stream_.file(), kAfpInfo, info);
        EXPECT_THAT(stream_.Run(way), Succeeded());
        EXPECT_EQ(std::nullopt, Attribute(stream_.file(), kAfpInfo));
        EXPECT_EQ(kept, Attribute(stream_.file(), kRecord));
        ASSERT_EQ(0, removexattr(stream_.file().c_str(), kRecord.c_str()));
    }
    // So does the one that another setting has left there.
    SetAttribute(samba_.file(), kDosAttributes, Dos(0x20));
    SetAttribute(samba_.file(), kAfpInfo, info);
    EXPECT_THAT(samba_.Set(kFinderInfoName, FinderInfo(4)), Succeeded());
    EXPECT_EQ(std::nullopt, Attribute(samba_.file(), kAfpInfo));
    Put(kept, 122, FinderInfo(4));
    EXPECT_EQ(kept, Attribute(samba_.file(), kRecord));
}

// ---- Marks --------------------------------------------------------------------------------------

TEST_F(ForeignTest, TheLockIsWhatClientsHonour) {
    SetAttribute(samba_.file(), kDosAttributes, Dos(0x22));
    for (const Share* share :
         {&samba_, &stream_, &all_streams_, &netatalk_, &netatalk_samba_, &linux_}) {
        EXPECT_EQ(Ascii("0"), share->Get(kLocked));
        EXPECT_THAT(share->Run({"lock", share->file()}), Succeeded());
        EXPECT_EQ(Ascii("1"), share->Get(kLocked));
    }
    EXPECT_EQ(Dos(0x23), Attribute(samba_.file(), kDosAttributes));
    EXPECT_EQ(std::nullopt, Attribute(samba_.file(), kRecord));
    EXPECT_EQ(Record(Bytes(32), "", 0x01A0), Attribute(netatalk_.file(), kRecord));
    struct stat info;
    ASSERT_EQ(0, stat(linux_.file().c_str(), &info));
    EXPECT_EQ(0444U, info.st_mode & 0777);
    for (const Share* share :
         {&samba_, &stream_, &all_streams_, &netatalk_, &netatalk_samba_, &linux_}) {
        EXPECT_THAT(share->Run({"unlock", share->file()}), Succeeded());
        EXPECT_EQ(Ascii("0"), share->Get(kLocked));
    }
    EXPECT_EQ(Dos(0x22), Attribute(samba_.file(), kDosAttributes));
    EXPECT_EQ(Record(Bytes(32)), Attribute(netatalk_.file(), kRecord));
    // Either of the two locks, and neither stays.
    SetAttribute(samba_.file(), kRecord, Record(FinderInfo(), "", 0x01A0));
    EXPECT_EQ(Ascii("1"), samba_.Get(kLocked));
    EXPECT_THAT(samba_.Run({"unlock", samba_.file()}), Succeeded());
    EXPECT_EQ(Record(FinderInfo()), Attribute(samba_.file(), kRecord));
}

// ---- Not treading on them -----------------------------------------------------------------------

TEST_F(ForeignTest, WhatClientsHaveHiddenIsHiddenOnVolumesOfTheLibrarysOwnToo) {
    const std::string word = "user.mavo.attributes";
    const Share from{"eadir"};
    const Share to{"eadir"};
    struct Case {
        std::uint8_t word, dos, copied_word;
    };
    // The word is what was so before a client changed the other. What is copied is to be archived.
    for (const Case& one : {Case{0x00, 0x02, 0x05}, Case{0x04, 0x20, 0x01}, Case{0x05, 0x02, 0x05},
                            Case{0x01, 0x00, 0x01}}) {
        SCOPED_TRACE(int{one.word});
        SetAttribute(from.file(), word, {0, 0, 0, one.word});
        SetAttribute(from.file(), kDosAttributes, Dos(one.dos));
        fs::remove(to.file());
        EXPECT_THAT(from.Run({"--volume", to.path() + "=eadir", "cp", from.file(), to.file()}),
                    Succeeded());
        EXPECT_EQ((Bytes{0, 0, 0, one.copied_word}), Attribute(to.file(), word));
        EXPECT_EQ(Dos(one.dos), Attribute(to.file(), kDosAttributes));
    }
    EXPECT_THAT(from.Run({"mv", from.file(), from.file() + "-moved"}), Succeeded());
    EXPECT_EQ(Dos(0x20), Attribute(from.file() + "-moved", kDosAttributes));
}

TEST_F(ForeignTest, NothingIsWrittenBesideAnotherProgramsMetadataUnlessItsTypeIsDeclared) {
    ASSERT_THAT(samba_.Set(kColour, Ascii("red")), Succeeded());
    const std::string other = samba_.path() + "/other";
    WriteFile(other, Ascii("data"));
    const std::string advice = "say so with --volume " + samba_.path() + "=samba";
    for (const Arguments& arguments :
         {Arguments{"set", samba_.file(), kColour, "blue"},
          Arguments{"set", other, kColour, "blue"}, Arguments{"remove", samba_.file(), kColour},
          Arguments{"lock", other}, Arguments{"cp", samba_.file(), samba_.path() + "/copy"}}) {
        const ToolResult result = RunTool(arguments);
        EXPECT_NE(0, result.status) << arguments[0];
        EXPECT_THAT(result.err, AllOf(HasSubstr("Samba keeps metadata there, by user.DosStream.*"),
                                      HasSubstr(advice)))
            << arguments[0];
    }
    EXPECT_EQ((std::vector<std::string>{"a", "other"}), Names(samba_.path()));
    EXPECT_EQ(Ascii("red") + Bytes{0}, Attribute(samba_.file(), kColourStream));
    // What is there is shown, and goes along to where it may.
    EXPECT_EQ(kColour + '\n', RunTool({"list", samba_.file()}).out);
    TempDir elsewhere;
    EXPECT_THAT(RunTool({"cp", samba_.file(), elsewhere / "copy"}), Succeeded());
    EXPECT_EQ("red", RunTool({"get", elsewhere / "copy", kColour}).out);
    EXPECT_EQ(std::nullopt, Attribute(elsewhere / "copy", kColourStream));
    // Whatever has such a program's name is taken along, by whomever else it is signed.
    SetAttribute(samba_.file(), "user." + kFinderInfoName, FinderInfo());
    EXPECT_THAT(RunTool({"cp", samba_.file(), elsewhere / "both"}), Succeeded());
    EXPECT_EQ(FinderInfo(), RunTool({"get", elsewhere / "both", kFinderInfoName}).bytes());
    EXPECT_EQ("red", RunTool({"get", elsewhere / "both", kColour}).out);
    // Whoever says that it is of another type is believed.
    EXPECT_EQ(0, RunTool({"--volume", samba_.path() + "=1", "set", other, kColour, "x"}).status);
}

// Samba takes a time of creation that a record does not know for one in 2068.
TEST_F(ForeignTest, ARecordThatKnowsWhenItsObjectWasBackedUpKnowsWhenItWasMade) {
    Bytes info = AfpInfo(FinderInfo());
    Put(info, 12, FromHex("11223344"));
    SetAttribute(stream_.file(), kAfpInfo, info + Bytes{0});
    SetAttribute(stream_.file(), kDosAttributes, Dos(0x20));
    const std::string to = samba_.path() + "/b";
    EXPECT_THAT(samba_.Run({"--volume", stream_.path() + "=samba-stream", "convert", "--to",
                            "samba", stream_.file(), to}),
                Succeeded());
    Bytes record = Record(FinderInfo());
    Put(record, 354, FromHex("32933d59800000001122334480000000"));
    EXPECT_EQ(record, Attribute(to, kRecord));

    // Without DOS attributes it is the oldest time that is known; the copy is a new file.
    lremovexattr(stream_.file().c_str(), kDosAttributes.c_str());
    const timespec times[] = {{1000000000, 0}, {1000000000, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, stream_.file().c_str(), times, 0));
    const std::string other = samba_.path() + "/c";
    EXPECT_THAT(samba_.Run({"--volume", stream_.path() + "=samba-stream", "convert", "--to",
                            "samba", stream_.file(), other}),
                Succeeded());
    Put(record, 354, FromHex("11223344800000001122334480000000"));
    EXPECT_EQ(record, Attribute(other, kRecord));

    // netatalk knows that nothing is known, until a record of its is changed where Samba reads it.
    Put(record, 354, FromHex("80000000800000001122334480000000"));
    SetAttribute(other, kRecord, record);
    ASSERT_EQ(0, utimensat(AT_FDCWD, other.c_str(), times, 0));
    EXPECT_THAT(samba_.Run({"set", other, kFinderInfoName, "--hex", std::string(64, '1')}),
                Succeeded());
    EXPECT_EQ(FromHex("032d8680"), Stretch(*Attribute(other, kRecord), 354, 4));
}

TEST_F(ForeignTest, DatesThatAreKeptInTwoPlacesAreReadTogether) {
    Bytes record = Record(FinderInfo());
    Put(record, 354, FromHex("01020304050607081122334480000000"));
    SetAttribute(samba_.file(), kRecord, record);
    const std::string away = stream_.path() + "/b";
    const std::string back = samba_.path() + "/b";
    const std::string volume = stream_.path() + "=samba-stream";
    EXPECT_THAT(
        samba_.Run({"--volume", volume, "convert", "--to", "samba-stream", samba_.file(), away}),
        Succeeded());
    EXPECT_EQ(FromHex("11223344"), Stretch(*Attribute(away, kAfpInfo), 12, 4));
    EXPECT_THAT(samba_.Run({"--volume", volume, "convert", "--to", "samba", away, back}),
                Succeeded());
    EXPECT_EQ(record, Attribute(back, kRecord));

    // Two that are both known and differ are two values.
    Bytes info = AfpInfo(FinderInfo());
    Put(info, 12, FromHex("11223345"));
    SetAttribute(away, kAfpInfo, info + Bytes{0});
    const ToolResult copied = samba_.Run({"--volume", volume, "cp", away, samba_.path() + "/c"});
    EXPECT_EQ(2, copied.status);
    EXPECT_THAT(copied.err, HasSubstr("a second file dates"));
}

// ---- Whatever bytes are there -------------------------------------------------------------------

// Every truncation of a value, and the limits of a byte in each place of it.
std::vector<Bytes> DamagedOnesOf(const Bytes& whole) {
    std::vector<Bytes> all;
    for (std::size_t size = 0; size < whole.size(); ++size) {
        all.push_back(Stretch(whole, 0, size));
    }
    for (std::size_t at = 0; at < whole.size(); ++at) {
        for (const unsigned byte : {0x00U, 0x01U, 0x7FU, 0x80U, 0xFFU}) {
            all.push_back(whole);
            all.back()[at] = static_cast<std::uint8_t>(byte);
        }
    }
    return all;
}

// One run of the tool for all values: each is an object's.
class HostileValueTest : public ForeignTest {
 protected:
    // `store` gives an object, by its directory and name, a value.
    template <class Store>
    static void ExpectReadable(const Share& share, const Bytes& whole, Store store) {
        const std::string tree = share.path() + "/tree";
        fs::create_directory(tree);
        int count = 0;
        for (const Bytes& value : DamagedOnesOf(whole)) {
            const std::string name = "o" + std::to_string(count++);
            WriteFile(tree + '/' + name, {});
            SetAttribute(tree + '/' + name, kColourStream, Ascii("red") + Bytes{0});
            store(tree, name, value);
        }
        const Arguments list = {"--json", "list", "-l", "-r", tree};
        for (const ToolResult& result : {share.Run(list), RunTool(list)}) {
            EXPECT_THAT(result.status, AnyOf(0, 2)) << result.err;
            EXPECT_EQ(count, CountOf("\"com.example.colour\"", result.out));
        }
        // Each goes along whole, or is named.
        const ToolResult copied = share.Run({"cp", "-r", tree, share.path() + "/copy"});
        EXPECT_THAT(copied.status, AnyOf(0, 2)) << copied.err;
        EXPECT_EQ(count, CountOf("\"com.example.colour\"",
                                 share.Run({"--json", "list", "-r", share.path() + "/copy"}).out));
        fs::remove_all(tree);
        fs::remove_all(share.path() + "/copy");
    }

    static auto AsAttribute(const std::string& attribute) {
        return [attribute](const std::string& tree, const std::string& name, const Bytes& value) {
            SetAttribute(tree + '/' + name, attribute, value);
        };
    }

    static int CountOf(const std::string& text, const std::string& in) {
        int count = 0;
        for (std::size_t at = 0; (at = in.find(text, at)) != std::string::npos; ++at) ++count;
        return count;
    }
};

TEST_F(HostileValueTest, OfARecord) {
    ExpectReadable(samba_, Record(FinderInfo(), "a comment", 0x01A0), AsAttribute(kRecord));
}

TEST_F(HostileValueTest, OfAnAfpInfo) {
    ExpectReadable(stream_, AfpInfo(FinderInfo()) + Bytes{0}, AsAttribute(kAfpInfo));
}

TEST_F(HostileValueTest, OfDosAttributes) {
    ExpectReadable(samba_, Dos(0x27), AsAttribute(kDosAttributes));
}

TEST_F(HostileValueTest, OfAValueThatGoesOn) {
    const std::string extent = "user.DosStreamExt.1.big:$DATA";
    ExpectReadable(samba_, Ascii("begins") + Bytes{1},
                   [&](const std::string& tree, const std::string& name, const Bytes& value) {
                       SetAttribute(tree + '/' + name, "user.DosStream.big:$DATA", value);
                       SetAttribute(tree + '/' + name, extent, Ascii("goes on"));
                   });
}

TEST_F(HostileValueTest, OfAFileBesideIt) {
    Bytes mac = ForkFile("the fork");
    Put(mac, 8, Ascii("Mac OS X        "));
    for (const Bytes& file : {ForkFile("the fork"), mac}) {
        ExpectReadable(samba_, file,
                       [](const std::string& tree, const std::string& name, const Bytes& value) {
                           WriteFile(tree + "/._" + name, value);
                       });
    }
}

// ---- streams_depot ------------------------------------------------------------------------------

// As smbd lays it out: directories by a hash of the object's device and inode.
class DepotTest : public ForeignTest {
 protected:
    static void MakeDepot(const std::string& root) {
        const fs::path streams = root + "/.streams/94/DE/01070000000000000E00000000000000";
        fs::create_directories(streams);
        WriteFile(streams / ":colour:$DATA", Ascii("red"));
    }
    static auto Refuses(const std::string& path, const std::string& by) {
        return Failed(2, path + ": Samba keeps streams elsewhere there, by " + by +
                             ", in a way that is not known: streams_depot; have smbd serve it "
                             "with streams_xattr, and copy what clients see onto that");
    }

    const TempDir undeclared_;
    const TempDir elsewhere_;
};

TEST_F(DepotTest, NothingIsWrittenBesideIt) {
    const std::string depot = samba_.path() + "/.streams";
    const std::string below = samba_.path() + "/d/e/b";
    fs::create_directories(samba_.path() + "/d/e");
    WriteFile(below, Ascii("data"));
    const std::string other = undeclared_ / "a";
    WriteFile(other, Ascii("data"));
    MakeDepot(samba_.path());
    MakeDepot(undeclared_.path());
    for (const std::string& path : {samba_.file(), below}) {
        const auto before = Attributes(path);
        EXPECT_THAT(samba_.Run({"set", path, kColour, "red"}), Refuses(path, depot));
        EXPECT_THAT(samba_.Run({"remove", path, kColour}), Refuses(path, depot));
        EXPECT_THAT(samba_.Run({"lock", path}), Refuses(path, depot));
        EXPECT_EQ(before, Attributes(path));
    }
    EXPECT_THAT(samba_.Run({"set", samba_.path(), kColour, "red"}), Refuses(samba_.path(), depot));
    EXPECT_THAT(RunTool({"set", other, kColour, "red"}),
                Refuses(other, undeclared_.path() + "/.streams"));
    // A copy with metadata as well; the data of one without goes.
    EXPECT_THAT(stream_.Set(kColour, Ascii("red")), Succeeded());
    const ToolResult copied = samba_.Run({"--volume", stream_.path() + "=samba-stream", "cp",
                                          stream_.file(), samba_.path() + "/copy"});
    EXPECT_NE(0, copied.status);
    EXPECT_THAT(copied.err, HasSubstr("streams_depot"));
    EXPECT_EQ((std::map<std::string, Bytes>{}), Attributes(samba_.path() + "/d/e"));
}

TEST_F(DepotTest, WhoReadsIsToldThatNotAllIsRead) {
    WriteFile(undeclared_ / "a", Ascii("data"));
    EXPECT_THAT(samba_.Set(kColour, Ascii("red")), Succeeded());
    MakeDepot(samba_.path());
    MakeDepot(undeclared_.path());
    const std::string depot = samba_.path() + "/.streams";
    const ToolResult listed = samba_.Run({"list", samba_.file()});
    EXPECT_EQ(2, listed.status);
    EXPECT_EQ(kColour + "\n", listed.out);
    EXPECT_THAT(listed.err, HasSubstr("by " + depot + ", in a way that is not known"));
    EXPECT_EQ(2, RunTool({"list", undeclared_ / "a"}).status);
    // What could not be read keeps a moved object where it is.
    const ToolResult moved = samba_.Run({"--volume", elsewhere_.path() + "=1", "convert", "--to",
                                         "eadir", samba_.file(), elsewhere_ / "a"});
    EXPECT_EQ(2, moved.status);
    EXPECT_THAT(moved.err, HasSubstr("streams_depot"));

    const ToolResult where = samba_.Run({"where", samba_.file()});
    EXPECT_THAT(where.out, HasSubstr("\n  other programs: Samba, with streams_depot, by " + depot));
    EXPECT_EQ(depot, samba_.Run({"--json", "where", samba_.file()}).json()["unknownStreams"]);
}

TEST_F(DepotTest, AnObjectSaysItselfThatItHasStreamsInOne) {
    SetAttribute(samba_.file(), "user.SAMBA_STREAMS", Bytes{'1'});
    EXPECT_THAT(samba_.Set(kColour, Ascii("red")), Refuses(samba_.file(), "user.SAMBA_STREAMS"));
    const ToolResult listed = samba_.Run({"list", samba_.file()});
    EXPECT_EQ(2, listed.status);
    EXPECT_THAT(listed.err, HasSubstr("by user.SAMBA_STREAMS, in a way that is not known"));
    WriteFile(samba_.path() + "/b", Ascii("data"));
    EXPECT_THAT(samba_.Run({"set", samba_.path() + "/b", kColour, "red"}), Succeeded());
}

TEST_F(DepotTest, WhoHasDeclaredAnotherProgramsTypeIsNotAsked) {
    MakeDepot(netatalk_.path());
    EXPECT_THAT(netatalk_.Set(kColour, Ascii("red")), Succeeded());
    EXPECT_THAT(netatalk_.Run({"list", netatalk_.file()}), Succeeded());
}

TEST_F(DepotTest, AnyOtherDirectoryOfThatNameIsNone) {
    fs::create_directories(samba_.path() + "/.streams/music/94");
    WriteFile(samba_.path() + "/.streams/95", {});
    fs::create_directory_symlink("music", samba_.path() + "/.streams/mu");
    EXPECT_THAT(samba_.Set(kColour, Ascii("red")), Succeeded());
    const TempDir target;
    MakeDepot(target.path());
    fs::create_directory_symlink(target.path() + "/.streams", stream_.path() + "/.streams");
    EXPECT_THAT(stream_.Set(kColour, Ascii("red")), Succeeded());
}

TEST_F(ForeignTest, WhereTellsWhoseMetadataItHasFoundAndHowToSaySo) {
    SetAttribute(netatalk_.file(), kRecord, Record(FinderInfo()));
    SetAttribute(stream_.file(), kAfpInfo, AfpInfo(FinderInfo()) + Bytes{0});
    SetAttribute(linux_.file(), "user." + kFinderInfoName, FinderInfo());
    SetAttribute(samba_.file(), kDosAttributes, Dos(0x20));
    const auto tells = [](const Share& share, const std::string& type, const std::string& by) {
        EXPECT_THAT(RunTool({"where", share.file()}).out,
                    HasSubstr(", by " + by + "; --volume PATH=" + type + " declares it\n"));
        const auto json = RunTool({"where", "--json", share.file()}).json();
        EXPECT_EQ(type, json["found"]["type"]);
        EXPECT_EQ(by, json["found"]["by"]);
    };
    tells(netatalk_, "netatalk", kRecord);
    tells(stream_, "samba-stream", "user.DosStream.AFP_AfpInfo");
    SetAttribute(all_streams_.file(), kAfpInfo, AfpInfo(FinderInfo()) + Bytes{0});
    SetAttribute(all_streams_.file(), kAfpResource, Ascii("fork") + Bytes{0});
    tells(all_streams_, "samba-all-streams", "user.DosStream.AFP_Resource");
    SetAttribute(all_streams_.file(), kRecord, Record(FinderInfo()));
    tells(all_streams_, "samba-stream", "user.DosStream.AFP_AfpInfo");
    tells(linux_, "linux", "user." + kFinderInfoName);
    tells(samba_, "samba", kDosAttributes);
    EXPECT_THAT(RunTool({"where", netatalk_samba_.file()}).out, Not(HasSubstr("other programs")));
    EXPECT_THAT(samba_.Run({"where", samba_.file()}).out,
                HasSubstr("volume type: samba, Samba, with netatalk's records (--volume "));
}

// ---- From place to place ------------------------------------------------------------------------

const char* const kAllTypes[] = {
    "samba", "samba-stream", "samba-all-streams", "netatalk", "netatalk-samba", "linux", "0", "1",
    "2"};

class ForeignTravelTest : public ::testing::TestWithParam<std::tuple<const char*, const char*>> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
        MAVOEA_SKIP_UNLESS_ROOT();
    }

    TempDir dir_;
};

// All that a Samba server keeps of a file and a directory.
TEST_P(ForeignTravelTest, EverythingArrivesAndComesBack) {
    const auto [first, second] = GetParam();
    const std::string from = dir_ / "from";
    const std::string to = dir_ / "to";
    const std::string back = dir_ / "back";
    ASSERT_EQ(0, mkdir(from.c_str(), 0755));
    ASSERT_EQ(0, mkdir((from + "/d").c_str(), 0755));
    WriteFile(from + "/a", Ascii("data"));
    WriteFile(from + "/d/none", Ascii("no metadata"));
    // A "._" file with attributes has no place for a comment, or an AFP word.
    const bool entries = std::string(first) != "0" && std::string(second) != "0";
    for (const std::string& path : {from + "/a", from + "/d"}) {
        SetAttribute(path, kColourStream, Ascii("red") + Bytes{0});
        SetAttribute(path,
                     "user.DosStream.com.example\xEF\x80\xA2"
                     "2:$DATA",
                     Bytes{0});
        SetAttribute(
            path, kRecord,
            WithoutDates(entries ? Record(FinderInfo(), "comment", 0x0400) : Record(FinderInfo())));
        SetAttribute(path, kDosAttributes, Dos(path.ends_with("/d") ? 0x16 : 0x27));
    }
    WriteFile(from + "/._a", ForkFile("fork"));

    const auto convert = [](const std::string& source, const std::string& type,
                            const std::string& target, const std::string& target_type) {
        return RunTool({"--volume", source + '=' + type, "convert", "-r", "--to", target_type,
                        source, target});
    };
    const std::string start = dir_ / "start";
    ASSERT_EQ(0, convert(from, "samba", start, first).status);
    ASSERT_EQ(0, convert(start, first, to, second).status);
    const ToolResult result = convert(to, second, back, "samba");
    EXPECT_EQ(0, result.status) << result.err;
    for (const char* const name : {"/a", "/d", "/d/none"}) {
        EXPECT_EQ(Attributes(from + name), Attributes(back + name)) << name;
    }
    EXPECT_EQ(ForkFile("fork"), ReadFile(back + "/._a"));
    EXPECT_EQ((std::vector<std::string>{"._a", "a", "d"}), Names(back));
    EXPECT_EQ((std::vector<std::string>{"none"}), Names(back + "/d"));
}

std::string NameOfPair(const ::testing::TestParamInfo<ForeignTravelTest::ParamType>& info) {
    std::string name =
        std::string(std::get<0>(info.param)) + "To" + std::string(std::get<1>(info.param));
    std::erase(name, '-');
    return name;
}

INSTANTIATE_TEST_SUITE_P(Pairs, ForeignTravelTest,
                         ::testing::Combine(::testing::ValuesIn(kAllTypes),
                                            ::testing::ValuesIn(kAllTypes)),
                         NameOfPair);

TEST_F(ForeignTest, ItGoesAlongWhenItsObjectIsMovedAndRemoved) {
    const auto fill = [&](const Share& share) {
        EXPECT_THAT(share.Set(kColour, Ascii("red")), Succeeded());
        EXPECT_THAT(share.Set(kFinderInfoName, FinderInfo()), Succeeded());
        EXPECT_THAT(share.Set(kForkName, Ascii("fork")), Succeeded());
    };
    for (const Share* share : {&samba_, &netatalk_, &linux_}) {
        fill(*share);
        const std::string moved = share->path() + "/moved";
        EXPECT_THAT(share->Run({"mv", share->file(), moved}), Succeeded());
        EXPECT_EQ("red", share->Run({"get", moved, kColour}).out);
        EXPECT_EQ("fork", share->Run({"get", moved, kForkName}).out);
        EXPECT_THAT(share->Run({"rm", moved}), Succeeded());
        EXPECT_EQ(std::vector<std::string>{}, Names(share->path()));
    }
}

TEST_F(ForeignTest, WhatIsReplacedLeavesNothingOfItsMetadata) {
    ASSERT_THAT(samba_.Set(kColour, Ascii("red")), Succeeded());
    ASSERT_THAT(samba_.Set(kFinderInfoName, FinderInfo()), Succeeded());
    ASSERT_THAT(samba_.Set(kForkName, Ascii("fork")), Succeeded());
    SetAttribute(samba_.file(), "user.plain", Ascii("of the file"));
    const std::string plain = samba_.path() + "/plain";
    WriteFile(plain, Ascii("new"));
    EXPECT_THAT(samba_.Run({"cp", plain, samba_.file()}), Succeeded());
    EXPECT_EQ("", samba_.Run({"list", samba_.file()}).out);
    EXPECT_FALSE(Exists(samba_.beside()));
    EXPECT_EQ(Ascii("of the file"), Attribute(samba_.file(), "user.plain"));
}

TEST_F(ForeignTest, FilesOfOtherServicesAndWhatHasNoPlaceAreNamed) {
    const std::string ea = samba_.path() + "/@eaDir";
    const std::string from = samba_.path() + "/b";
    WriteFile(from, Ascii("data"));
    ASSERT_EQ(0, RunTool({"--volume", samba_.path() + "=1", "set", from, kColour, "red"}).status);
    WriteFile(ea + "/b@Preview", Ascii("of another service"));
    const ToolResult result =
        RunTool({"--volume", samba_.path() + "=1", "--volume", netatalk_.path() + "=netatalk", "cp",
                 from, netatalk_.path() + "/b"});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("\"@Preview\" of another service (volumes of the "
                                      "destination's type keep no such file)"));
    EXPECT_EQ(Ascii("red"), Attribute(netatalk_.path() + "/b", "user." + kColour));
}

TEST_F(ForeignTest, ACopyOfASymbolicLinkHasNothingToKeep) {
    for (const Share* share : {&samba_, &linux_}) {
        const std::string link = share->path() + "/link";
        ASSERT_EQ(0, symlink("nowhere", link.c_str()));
        EXPECT_THAT(share->Run({"cp", "-P", link, share->path() + "/copy"}), Succeeded());
        EXPECT_EQ(2, share->Run({"set", link, kColour, "red"}).status);
    }
}

TEST_F(ForeignTest, RecordsAreShownFromTheAttributeOfTheirProgram) {
    SetAttribute(samba_.file(), kRecord, Record(FinderInfo(), "comment"));
    for (const ToolResult& result : {samba_.Run({"dump", "--record", samba_.file()}),
                                     RunTool({"dump", "--record", samba_.file()})}) {
        EXPECT_EQ(0, result.status);
        EXPECT_THAT(result.out, AllOf(HasSubstr("attribute " + kRecord), HasSubstr("comment")));
    }
}

}  // namespace
}  // namespace mavoea::test

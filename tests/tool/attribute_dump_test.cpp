// What the tool shows of the attributes in which other programs keep metadata, and what it finds
// wrong with them.

#include <gtest/gtest.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <functional>
#include <random>

#include "tests/support/snapshot.h"
#include "tests/tool/holdings.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

const std::string kDos = "user.DOSATTRIB";
const std::string kAfpInfo = "user.DosStream.AFP_AfpInfo:$DATA";

class AttributeDumpTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(dir_.path());
        WriteFile(object_, Ascii("data"));
    }

    ToolResult Dump(const Arguments& more = {}, const std::string& type = "samba") const {
        Arguments arguments = {"--volume", dir_.path() + '=' + type, "dump", "--attributes",
                               object_};
        arguments.insert(arguments.end(), more.begin(), more.end());
        return RunTool(arguments);
    }
    // The text of one attribute alone.
    std::string TextOf(const std::string& name, const Bytes& value) const {
        SetFileAttribute(object_, name, value);
        const ToolResult result = Dump();
        EXPECT_EQ(0, removexattr(object_.c_str(), name.c_str()));
        return result.out;
    }
    // Violations or notes of it. The exit status must go with them, and the text must have the
    // same.
    std::vector<std::string> Said(const std::string& kind, const std::string& name,
                                  const Bytes& value, const std::string& type = "samba") const {
        SetFileAttribute(object_, name, value);
        const ToolResult text = Dump({}, type);
        const nlohmann::json json = Dump({"--json"}, type).json();
        EXPECT_EQ(0, removexattr(object_.c_str(), name.c_str()));
        const std::size_t violations = json[0]["violations"].size();
        EXPECT_EQ(violations == 0 ? 0 : 2, text.status);
        if (violations > 0) {
            EXPECT_THAT(text.err, HasSubstr("its attributes are violated in " +
                                            std::to_string(violations) + " place"));
        }
        const std::vector<std::string> lines = json[0][kind + "s"];
        for (const std::string& line : lines) {
            EXPECT_THAT(text.out, HasSubstr(kind + ": " + line + "\n"));
        }
        return lines;
    }
    std::vector<std::string> Violations(const std::string& name, const Bytes& value,
                                        const std::string& type = "samba") const {
        return Said("violation", name, value, type);
    }
    std::vector<std::string> Notes(const std::string& name, const Bytes& value) const {
        EXPECT_THAT(Violations(name, value), IsEmpty());
        return Said("note", name, value);
    }

    const TempDir dir_;
    const std::string object_ = dir_ / "object";
};

// ---- DOS attributes -----------------------------------------------------------------------------

// Version 5: hidden and archive, made on 2024-05-02 at 00:00:00 UTC.
Bytes Version5() {
    return Hex(
        "00 00 05 00 05 00 00 00  11 00 00 00  22 00 00 00"
        "00 40 EF AC 23 9C DA 01");
}

TEST_F(AttributeDumpTest, EveryFieldOfDosAttributesIsShown) {
    EXPECT_EQ(object_ +
                  ": user.DOSATTRIB, DOS attributes, 24 bytes\n"
                  "version         5\n"
                  "valid flags     0x00000011: attributes, creation time\n"
                  "attributes      0x00000022: hidden, archive\n"
                  "creation time   2024-05-02T00:00:00Z (133590816000000000)\n",
              TextOf(kDos, Version5()));
    // Version 3 says its attributes twice.
    EXPECT_EQ(object_ +
                  ": user.DOSATTRIB, DOS attributes, 52 bytes\n"
                  "text            \"0x1\"\n"
                  "version         3\n"
                  "valid flags     0x00000001: attributes\n"
                  "attributes      0x00000001: read-only\n"
                  "creation time   unknown (0)\n",
              TextOf(kDos, Hex("'0x1' 00  03 00 03 00  01 00 00 00  01 00 00 00") + Bytes(36)));
    EXPECT_EQ(object_ +
                  ": user.DOSATTRIB, DOS attributes, 5 bytes\n"
                  "text            \"0x26\"\n"
                  "attributes      0x00000026: hidden, system, archive\n",
              TextOf(kDos, Hex("'0x26' 00")));
    EXPECT_THAT(TextOf(kDos, Hex("'0x80000007'")),
                HasSubstr("0x80000007: read-only, hidden, system, unknown 0x80000000\n"));
}

TEST_F(AttributeDumpTest, DosAttributesThatSambaDoesNotTakeAreViolations) {
    EXPECT_THAT(Violations(kDos, Version5()), IsEmpty());
    const std::string none =
        "it is no number, and too short for a version: Samba takes it for none";
    EXPECT_THAT(Violations(kDos, {}), ElementsAre(none));
    EXPECT_THAT(Violations(kDos, Hex("00 00 05")), ElementsAre(none));
    EXPECT_THAT(Violations(kDos, Ascii("words")), ElementsAre(none));
    Bytes value = Version5();
    value[2] = value[4] = 6;
    EXPECT_THAT(Violations(kDos, value), ElementsAre("its version is 6, not 1 to 5"));
    value = Version5();
    value[4] = 4;
    EXPECT_THAT(Violations(kDos, value), ElementsAre("its version is 5, and then 4"));
    for (std::size_t size = 6; size < 24; ++size) {
        value = Version5();
        value.resize(size);
        EXPECT_THAT(Violations(kDos, value), ElementsAre("it has " + std::to_string(size) +
                                                         " bytes, and one of version 5 24"));
    }
}

TEST_F(AttributeDumpTest, WhatIsUnusualInDosAttributesIsNoted) {
    EXPECT_THAT(Notes(kDos, Version5()), IsEmpty());
    Bytes value = Version5();
    value[8] = 0x10;
    EXPECT_THAT(Notes(kDos, value), ElementsAre("its flags say that the attributes are not valid"));
    value[8] = 0x01;
    EXPECT_THAT(Notes(kDos, value),
                ElementsAre("its flags say that the creation time is not valid"));
    value = Version5();
    std::fill(value.begin() + 16, value.end(), std::uint8_t{0});
    EXPECT_THAT(Notes(kDos, value),
                ElementsAre("its flags say that the creation time is valid, which is 0"));
}

// ---- Streams ------------------------------------------------------------------------------------

TEST_F(AttributeDumpTest, EveryFieldOfAStreamIsShown) {
    // "a:b" as Macs have it.
    const std::string name =
        "user.DosStream.a\xEF\x80\xA2"
        "b:$DATA";
    const std::string text = TextOf(name, Hex("'value' 00"));
    EXPECT_THAT(text, HasSubstr(", stream of Samba, 6 bytes\n"
                                "stream          \"a:b\"\n"
                                "bytes           5\n"
                                "last byte       0x00\n"));
    EXPECT_THAT(TextOf("user.DosStream.AFP_Resource:$DATA", Hex("'fork' 00")),
                HasSubstr(", resource fork of Samba, 5 bytes\n"));
}

TEST_F(AttributeDumpTest, StreamsThatGoOnAreShownWithWhatTheyGoOnIn) {
    SetFileAttribute(object_, "user.DosStream.a:$DATA", Hex("'begin' 02"));
    SetFileAttribute(object_, "user.DosStreamExt.1.a:$DATA", Hex("'middle'"));
    SetFileAttribute(object_, "user.DosStreamExt.2.a:$DATA", Hex("'end'"));
    const ToolResult result = Dump();
    EXPECT_EQ(0, result.status) << result.err;
    EXPECT_THAT(result.out, HasSubstr("last byte       0x02\nextents         2\n"));
    EXPECT_THAT(result.out, HasSubstr("extent of a stream of Samba, 6 bytes\n"
                                      "stream          \"a\"\nextent          1\n"));
    ASSERT_EQ(0, removexattr(object_.c_str(), "user.DosStreamExt.1.a:$DATA"));
    const ToolResult missing = Dump();
    EXPECT_EQ(2, missing.status);
    EXPECT_THAT(missing.out, HasSubstr("violation: extent 1 of 2 is missing\n"));
}

TEST_F(AttributeDumpTest, StreamsThatSambaCannotReadAreViolations) {
    EXPECT_THAT(Violations("user.DosStream.a:$DATA", Hex("'value' 00")), IsEmpty());
    EXPECT_THAT(Violations("user.DosStream.a:$DATA", {}),
                ElementsAre("it has no bytes at all, and Samba cannot open it"));
    EXPECT_THAT(Violations("user.DosStream.a:$DATA", Ascii("value")),
                ElementsAre("its last byte is 0x65, and neither a NUL nor the number of values "
                            "that go on with it"));
    EXPECT_THAT(Violations("user.DosStream.a", Hex("'value' 00")),
                ElementsAre("its name is that of no stream"));
    EXPECT_THAT(Violations("user.DosStreamExt.1.a:$DATA", Ascii("more")),
                ElementsAre("no stream goes on in it"));
}

// ---- AFP_AfpInfo --------------------------------------------------------------------------------

Bytes AfpInfo() {
    return Hex("'AFP' 00  00 00 01 00  00 00 00 00  80 00 00 00") + Ascii("TEXTttxt") + Bytes(24) +
           Hex("00 01 00 00 00 02") + Bytes(7);
}

TEST_F(AttributeDumpTest, EveryFieldOfSambasFinderInfoIsShown) {
    EXPECT_EQ(object_ + ": " + kAfpInfo +
                  ", Finder info of Samba, 61 bytes\n"
                  "stream          \"AFP_AfpInfo\"\n"
                  "bytes           60\n"
                  "last byte       0x00\n"
                  "signature       0x41465000\n"
                  "version         0x00000100\n"
                  "reserved        0x00000000\n"
                  "backup time     unknown (-2147483648)\n"
                  "Finder info     5445585474747874" +
                  std::string(48, '0') +
                  "\n"
                  "ProDOS info     000100000002\n"
                  "reserved        000000000000\n",
              TextOf(kAfpInfo, AfpInfo()));
    SetFileAttribute(object_, kAfpInfo, AfpInfo());
    const nlohmann::json json = Dump({"--json"}).json()[0];
    EXPECT_EQ(kAfpInfo, json["attribute"]);
    EXPECT_EQ(0x41465000, json["signature"]);
    EXPECT_EQ(0x100, json["version"]);
    EXPECT_EQ(0x80000000, json["backupTime"]);
    EXPECT_EQ("000100000002", json["prodosInfo"]);
}

TEST_F(AttributeDumpTest, FinderInfoThatSambaDoesNotTakeIsAViolation) {
    EXPECT_THAT(Violations(kAfpInfo, AfpInfo()), IsEmpty());
    Bytes value = AfpInfo();
    value[0] = 'B';
    EXPECT_THAT(Violations(kAfpInfo, value), ElementsAre("its signature is not \"AFP\" and a NUL"));
    value = AfpInfo();
    value[7] = 1;
    EXPECT_THAT(Violations(kAfpInfo, value), ElementsAre("its version is not 0x00000100"));
    for (const std::size_t size : {2u, 30u, 60u, 62u}) {
        value = AfpInfo();
        value.resize(size);
        value.back() = 0;
        EXPECT_THAT(Violations(kAfpInfo, value),
                    ElementsAre("it has " + std::to_string(size - 1) +
                                " bytes before the last, and not 60: Samba removes it"));
    }
}

TEST_F(AttributeDumpTest, WhatIsUnusualInSambasFinderInfoIsNoted) {
    Bytes value = AfpInfo();
    std::fill(value.begin() + 16, value.begin() + 48, std::uint8_t{0});
    EXPECT_THAT(Notes(kAfpInfo, value),
                ElementsAre("it has no Finder info, and Samba takes it for none"));
    for (const std::size_t at : {8u, 59u}) {
        value = AfpInfo();
        value[at] = 1;
        EXPECT_THAT(Notes(kAfpInfo, value), ElementsAre("what is reserved is not zero"));
    }
}

// ---- Records and plain attributes ---------------------------------------------------------------

TEST_F(AttributeDumpTest, TheRecordIsShownAmongThem) {
    const std::string name = "user.org.netatalk.Metadata";
    const Bytes record = RecordOf({.finder_info = Pattern(32, 1), .comment = Ascii("remark")});
    EXPECT_THAT(TextOf(name, record), HasSubstr("netatalk record, attribute " + name));
    EXPECT_THAT(TextOf(name, record), HasSubstr("comment         \"remark\"\n"));
    EXPECT_THAT(Violations(name, record), IsEmpty());
    EXPECT_THAT(Violations(name, Bytes(402)), Not(IsEmpty()));
}

TEST_F(AttributeDumpTest, PlainAttributesAreShownAsTheyAre) {
    EXPECT_EQ(object_ +
                  ": user.colour, attribute, 4 bytes\n"
                  "name            \"colour\"\n"
                  "value           626c7565 \"blue\"\n",
              TextOf("user.colour", Ascii("blue")));
    EXPECT_THAT(TextOf("user.long", Repeat('x', 65)), HasSubstr("7878... \"xxx"));
    EXPECT_THAT(TextOf("user.com.apple.ResourceFork", Ascii("fork")),
                HasSubstr(", resource fork, 4 bytes\n"));
    EXPECT_THAT(Violations("user.com.apple.FinderInfo", Bytes(32)), IsEmpty());
    EXPECT_THAT(Violations("user.com.apple.FinderInfo", Bytes(31)),
                ElementsAre("it has 31 bytes, and not 32"));
    EXPECT_THAT(Violations("user.colour", Hex("'blue' 00"), "netatalk-samba"), IsEmpty());
    EXPECT_THAT(Violations("user.colour", Ascii("blue"), "netatalk-samba"),
                ElementsAre("it does not end with the NUL that netatalk puts behind it there"));
}

TEST_F(AttributeDumpTest, ObjectsWithoutAnyAreToldSo) {
    EXPECT_THAT(Dump(),
                Failed(1, object_ + ": no attributes of users or of other programs; mavoea where "
                                    "PATH has the files in which metadata may be"));
    EXPECT_EQ(2, RunTool({"dump", "--record", "--attributes", object_}).status);
    ASSERT_EQ(0, unlink(object_.c_str()));
    ASSERT_EQ(0, symlink("elsewhere", object_.c_str()));
    EXPECT_EQ(1, Dump().status);
}

TEST_F(AttributeDumpTest, LookingChangesNothing) {
    SetFileAttribute(object_, kDos, Version5());
    SetFileAttribute(object_, kAfpInfo, AfpInfo());
    const auto before = TakeSnapshot(dir_.path());
    EXPECT_EQ(0, Dump().status);
    EXPECT_EQ(0, Dump({"--json"}).status);
    EXPECT_EQ(before, TakeSnapshot(dir_.path()));
}

// Whatever is in them.
TEST_F(AttributeDumpTest, NoBytesAreTooMuchForIt) {
    std::minstd_rand random(20240502);
    for (int round = 0; round < 60; round += static_cast<int>(SeriesStep())) {
        SCOPED_TRACE(round);
        for (const std::string& name : {kDos, kAfpInfo, std::string("user.DosStream.a:$DATA"),
                                        std::string("user.org.netatalk.Metadata")}) {
            Bytes value = name == kDos ? Version5() : AfpInfo();
            value[random() % value.size()] = static_cast<std::uint8_t>(random());
            value.resize(random() % (value.size() + 1));
            SetFileAttribute(object_, name, value);
        }
        const ToolResult result = Dump();
        EXPECT_THAT(result.status, ::testing::AnyOf(0, 2)) << result.err;
    }
}

}  // namespace
}  // namespace mavoea::test

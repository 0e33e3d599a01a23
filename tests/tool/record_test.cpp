// Netatalk records: what the tool shows of them, and Finder info in both places of file-EA volumes.

#include <gtest/gtest.h>
#include <sys/xattr.h>
#include <unistd.h>

#include "tests/support/mac_files.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;

const std::string kFinderInfo = "com.apple.FinderInfo";
const std::string kRecordAttribute = "user.netatalk.Metadata";
const std::string kFlushTime = "user.mavo.filea.flushtime";

// Where AttributeRecord() has its Finder info.
constexpr std::ptrdiff_t kFinderInfoAt = 122;

std::optional<Bytes> Attribute(const std::string& path, const std::string& name) {
    Bytes value(2048);
    const ssize_t size = getxattr(path.c_str(), name.c_str(), value.data(), value.size());
    if (size < 0) return std::nullopt;
    value.resize(static_cast<std::size_t>(size));
    return value;
}

void SetAttribute(const std::string& path, const std::string& name, const Bytes& value) {
    ASSERT_EQ(0, setxattr(path.c_str(), name.c_str(), value.data(), value.size(), 0));
}

Bytes RecordWith(const Bytes& finder_info) {
    Bytes record = AttributeRecord();
    std::copy(finder_info.begin(), finder_info.end(), record.begin() + kFinderInfoAt);
    return record;
}

class RecordTest : public ::testing::Test {
 protected:
    void SetUp() override { MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume_.path()); }

    ToolResult Dump() const { return volume_.Run({"dump", "--record", volume_.object()}); }

    Volume volume_{2};
};

// ---- Finder info in two places ------------------------------------------------------------------

TEST_F(RecordTest, TheRecordIsBelievedBeforeTheResourceFileAndThatBeforeTheStream) {
    MAVOEA_SKIP_UNLESS_ROOT();
    ASSERT_THAT(volume_.Set("a", Ascii("1")), Succeeded());
    WriteFile(volume_.stream(), StreamImage{.finder_info = Pattern(32, 3)}.Build());
    EXPECT_EQ(Pattern(32, 3), volume_.Get(kFinderInfo).bytes());
    WriteFile(volume_.resource(), PlainAppleDouble(Pattern(32, 2), {}));
    EXPECT_EQ(Pattern(32, 2), volume_.Get(kFinderInfo).bytes());
    SetAttribute(volume_.object(), kRecordAttribute, RecordWith(Pattern(32, 1)));
    EXPECT_EQ(Pattern(32, 1), volume_.Get(kFinderInfo).bytes());
    EXPECT_THAT(volume_.Run({"list", "-l", volume_.object()}).out,
                HasSubstr("Finder info    com.apple.FinderInfo  " + volume_.object() + "\n"));
    // A record without any says nothing.
    SetAttribute(volume_.object(), kRecordAttribute, RecordWith(Bytes(32)));
    EXPECT_EQ(Pattern(32, 2), volume_.Get(kFinderInfo).bytes());
}

TEST_F(RecordTest, SettingKeepsTheOtherEntriesOfTheRecordAndStampsTheTime) {
    MAVOEA_SKIP_UNLESS_ROOT();
    Bytes record = RecordWith(Pattern(32, 1));
    PutU32(record, 26 + 12 + 8, 7);  // the comment's length
    const Bytes comment = Ascii("comment");
    std::copy(comment.begin(), comment.end(), record.begin() + 154);
    SetAttribute(volume_.object(), kRecordAttribute, record);
    ASSERT_THAT(volume_.Set(kFinderInfo, Pattern(32, 9)), Succeeded());

    const Bytes wanted = Pattern(32, 9);
    std::copy(wanted.begin(), wanted.end(), record.begin() + kFinderInfoAt);
    EXPECT_EQ(record, Attribute(volume_.object(), kRecordAttribute));
    const Bytes file = ReadFile(volume_.resource());
    ASSERT_EQ(82U, file.size());
    EXPECT_EQ(wanted, Bytes(file.begin() + 50, file.end()));
    const auto stamp = Attribute(volume_.object(), kFlushTime);
    ASSERT_TRUE(stamp);
    EXPECT_EQ(4U, stamp->size());
}

TEST_F(RecordTest, SettingMakesARecordWhereThereIsNone) {
    MAVOEA_SKIP_UNLESS_ROOT();
    ASSERT_THAT(volume_.Set(kFinderInfo, Pattern(32, 9)), Succeeded());
    const auto record = Attribute(volume_.object(), kRecordAttribute);
    ASSERT_TRUE(record);
    ASSERT_EQ(402U, record->size());
    EXPECT_EQ(Pattern(32, 9), Bytes(record->begin() + 122, record->begin() + 154));
    EXPECT_TRUE(Attribute(volume_.object(), kFlushTime));
}

TEST_F(RecordTest, RemovingClearsBothPlacesAndStampsTheTime) {
    MAVOEA_SKIP_UNLESS_ROOT();
    for (const bool through_zeros : {false, true}) {
        ASSERT_THAT(volume_.Set(kFinderInfo, Pattern(32, 9)), Succeeded());
        const Bytes record = RecordWith(Pattern(32, 9));
        SetAttribute(volume_.object(), kRecordAttribute, record);
        ASSERT_EQ(0, removexattr(volume_.object().c_str(), kFlushTime.c_str()));
        EXPECT_THAT(
            through_zeros ? volume_.Set(kFinderInfo, Bytes(32)) : volume_.Remove(kFinderInfo),
            Succeeded());
        EXPECT_EQ(1, volume_.Get(kFinderInfo).status);
        EXPECT_EQ(RecordWith(Bytes(32)), Attribute(volume_.object(), kRecordAttribute));
        EXPECT_TRUE(Attribute(volume_.object(), kFlushTime));
    }
}

TEST_F(RecordTest, WhatOnlyTheRecordHasIsRemovedWithoutMakingAFile) {
    SetAttribute(volume_.object(), kRecordAttribute, AttributeRecord());
    EXPECT_THAT(volume_.Remove(kFinderInfo), Succeeded());
    EXPECT_EQ(1, volume_.Remove(kFinderInfo).status);
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume_.path()));
}

TEST_F(RecordTest, ADamagedRecordIsToldAndNotOverwritten) {
    Bytes short_one = AttributeRecord();
    short_one.resize(401);
    Bytes other_magic = AttributeRecord();
    other_magic[0] = 1;
    Bytes lying = AttributeRecord();
    PutU32(lying, 26 + 4, 1023);
    Bytes incomplete = AttributeRecord();
    PutU16(incomplete, 24, 7);
    for (const Bytes& record : {short_one, other_magic, lying, incomplete, Ascii("x")}) {
        SetAttribute(volume_.object(), kRecordAttribute, record);
        const std::string message = volume_.object() +
                                    ": its netatalk record is damaged; look at it with: mavoea "
                                    "dump --record PATH";
        EXPECT_THAT(volume_.Set(kFinderInfo, Pattern(32)), Failed(2, message));
        EXPECT_THAT(volume_.Set(kFinderInfo, Bytes(32)), Failed(2, message));
        EXPECT_THAT(volume_.Remove(kFinderInfo), Failed(2, message));
        EXPECT_THAT(volume_.Get(kFinderInfo), Failed(2, message));
        EXPECT_EQ(record, Attribute(volume_.object(), kRecordAttribute));
        EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume_.path()));

        const ToolResult dump = Dump();
        EXPECT_EQ(2, dump.status);
        EXPECT_THAT(dump.out, HasSubstr("violation: "));
        EXPECT_EQ("mavoea: " + volume_.object() +
                      ": its netatalk record is damaged; let the AFP service write it anew, or "
                      "remove it\n",
                  dump.err);
    }
}

TEST_F(RecordTest, ARecordWithTooShortAFinderInfoHasNoRoomForOne) {
    Bytes record = AttributeRecord();
    PutU32(record, 26 + 8, 31);
    SetAttribute(volume_.object(), kRecordAttribute, record);
    EXPECT_THAT(volume_.Set(kFinderInfo, Pattern(32)),
                Failed(2, volume_.object() + ": its netatalk record has no room for Finder info; "
                                             "look at it with: mavoea dump --record PATH"));
    EXPECT_EQ(record, Attribute(volume_.object(), kRecordAttribute));
    EXPECT_EQ(std::vector<std::string>{"file.txt"}, NamesIn(volume_.path()));
}

TEST(RecordOfOtherVolumesTest, TheRecordOfAnEaDirectoryVolumeIsLeftAlone) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const Volume volume(1);
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(volume.path());
    SetAttribute(volume.object(), kRecordAttribute, AttributeRecord());
    EXPECT_EQ(1, volume.Get(kFinderInfo).status);
    ASSERT_THAT(volume.Set(kFinderInfo, Pattern(32, 9)), Succeeded());
    EXPECT_EQ(AttributeRecord(), Attribute(volume.object(), kRecordAttribute));
    EXPECT_FALSE(Attribute(volume.object(), kFlushTime));
}

// ---- What dump shows ----------------------------------------------------------------------------

TEST_F(RecordTest, EveryEntryOfARecordIsShown) {
    Bytes record = AttributeRecord();
    PutU32(record, 26 + 12 + 8, 7);
    const Bytes comment = Ascii("comm\nt!");
    std::copy(comment.begin(), comment.end(), record.begin() + 154);
    // Created at the epoch, modified a day later, never backed up, accessed a second before it.
    const Bytes dates = Hex("00000000 00015180 80000000 FFFFFFFF");
    std::copy(dates.begin(), dates.end(), record.begin() + 354);
    PutU16(record, 372, 0x05A1);
    for (const std::size_t entry : {4U, 5U, 6U, 7U}) {
        PutU32(record, 26 + entry * 12 + 8, entry == 7 ? 4 : 8);
    }
    const Bytes identity = Pattern(28, 0x10);
    std::copy(identity.begin(), identity.end(), record.begin() + 374);
    SetAttribute(volume_.object(), kRecordAttribute, record);

    const ToolResult text = Dump();
    EXPECT_THAT(text, Succeeded());
    EXPECT_THAT(
        text.out,
        AllOf(HasSubstr(volume_.object() +
                        ": netatalk record, attribute user.netatalk.Metadata, 402 bytes\n"),
              HasSubstr("  4  id 0x80444556 (private device)  offset 374  length 8\n"),
              HasSubstr("comment         \"comm\\x0At!\"\n"),
              HasSubstr("file dates      created 2000-01-01T00:00:00Z (0), modified "
                        "2000-01-02T00:00:00Z (86400), backed up unknown (-2147483648), accessed "
                        "1999-12-31T23:59:59Z (-1)\n"),
              HasSubstr("AFP file info   attributes 0x05A1: invisible, no write, no rename, no "
                        "delete, no copy\n"),
              HasSubstr("private inode   "), HasSubstr("private sync    "),
              HasSubstr("private id      ")));

    const auto json = volume_.Run({"--json", "dump", "--record", volume_.object()}).json();
    ASSERT_EQ(1U, json.size());
    const auto& entries = json[0]["entries"];
    EXPECT_EQ("comm\nt!", entries[1]["text"]);
    EXPECT_EQ(86400, entries[2]["dates"]["modified"]["seconds"]);
    EXPECT_EQ("2000-01-02T00:00:00Z", entries[2]["dates"]["modified"]["time"]);
    EXPECT_EQ("unknown", entries[2]["dates"]["backedUp"]["time"]);
    EXPECT_EQ(0x05A1, entries[3]["attributes"]);
    EXPECT_EQ("no write", entries[3]["attributeNames"][1]);
    EXPECT_EQ("private id", entries[7]["name"]);
    EXPECT_EQ(8U, entries[7]["hex"].get<std::string>().size());
    EXPECT_EQ(nlohmann::json::array(), json[0]["violations"]);
}

TEST_F(RecordTest, BothPlacesAreShownAndNothingIsConvertedOnTheWay) {
    MAVOEA_SKIP_UNLESS_ROOT();
    ASSERT_THAT(volume_.Set("com.apple.ResourceFork", Ascii("make the directory")), Succeeded());
    const MacFile file = NetatalkFile(Pattern(32, 1), Pattern(1000));
    WriteFile(volume_.resource(), file.bytes);
    SetAttribute(volume_.object(), kRecordAttribute, AttributeRecord());
    const ToolResult dump = Dump();
    EXPECT_THAT(dump, Succeeded());
    EXPECT_THAT(dump.out,
                AllOf(HasSubstr(volume_.object() + ": netatalk record, attribute "),
                      HasSubstr("\n\n" + volume_.resource() +
                                ": netatalk record, head of a resource file, 741 bytes\n"),
                      HasSubstr("real name       \"object\"\n"),
                      HasSubstr("comment         \"comment\"\n")));
    EXPECT_EQ(file.bytes, ReadFile(volume_.resource()));
    // The whole file shows the same entries.
    const ToolResult whole = RunTool({"dump", volume_.resource()});
    EXPECT_THAT(whole, Succeeded());
    EXPECT_THAT(whole.out, HasSubstr("private id      a9aaabac\n"));
}

TEST_F(RecordTest, NoRecordIsNotFound) {
    const std::string message = volume_.object() +
                                ": no netatalk record; mavoea where PATH has the files in which "
                                "metadata may be";
    EXPECT_THAT(Dump(), Failed(1, message));
    const ToolResult json = volume_.Run({"--json", "dump", "--record", volume_.object()});
    EXPECT_EQ(1, json.status);
    EXPECT_EQ("[]\n", json.out);
    if (::geteuid() != 0) return;
    ASSERT_THAT(Volume(1).Set(kFinderInfo, Pattern(32)), Succeeded());
    const Volume other(1);
    ASSERT_THAT(other.Set(kFinderInfo, Pattern(32)), Succeeded());
    EXPECT_EQ(1, other.Run({"dump", "--record", other.object()}).status)
        << "a file of 82 bytes has none";
    EXPECT_EQ(1, other.Run({"dump", "--record", other.path() + "/missing"}).status);
}

TEST_F(RecordTest, NoBytesInARecordsPlaceMakeTheToolFail) {
    const Bytes record = AttributeRecord();
    for (std::size_t at = 0; at < 122; at += SeriesStep()) {
        Bytes damaged = record;
        damaged[at] = 0xFF;
        SetAttribute(volume_.object(), kRecordAttribute, damaged);
        const int status = Dump().status;
        EXPECT_TRUE(status == 0 || status == 2) << at;
        // What dump finds sound, the library reads.
        EXPECT_EQ(status, volume_.Get("mavoea.locked").status) << at;
    }
    for (std::size_t size = 0; size < 402; size += 7) {
        SetAttribute(volume_.object(), kRecordAttribute,
                     Bytes(record.begin(), record.begin() + static_cast<std::ptrdiff_t>(size)));
        EXPECT_EQ(2, Dump().status) << size;
    }
}

}  // namespace
}  // namespace mavoea::test

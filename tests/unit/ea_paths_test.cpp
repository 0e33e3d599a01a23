// Where the metadata of an object lies: the four path functions, their bounds and their failures.

#include <errno.h>
#include <limits.h>
#include <stddef.h>

#include <algorithm>
#include <functional>
#include <ostream>
#include <random>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::Field;
using ::testing::IsEmpty;
using ::testing::Matcher;

constexpr int kRoom = MAVOEA_PATH_SIZE - 1;  // the size that callers pass
constexpr int kEndless = 10000;              // a size that refuses nothing
constexpr int kErrnoBefore = EXDEV;          // set before every call; no function here sets it
constexpr char kCanary = '\x5c';
constexpr std::size_t kCanaries = 64;  // behind the cbBuf + 1 bytes that may be written

// What a call did: its result and errno, what it recorded, and what became of the buffer.
struct Outcome {
    int result = 0;
    int error = 0;
    std::vector<Record> records;
    std::string text;            // empty when nothing was written
    bool wrote = false;          // any byte of the buffer
    bool wrote_behind = false;   // any byte behind the terminating NUL
    bool left_unended = false;   // no NUL although something was written
    bool allocated = false;      // anything at all
    int blocks_left_behind = 0;  // allocated and not freed
};

void PrintTo(const Outcome& outcome, std::ostream* out) {
    *out << "{result " << outcome.result << ", errno " << outcome.error << ", text \""
         << outcome.text << "\", records " << ::testing::PrintToString(outcome.records)
         << (outcome.wrote ? ", wrote" : "") << (outcome.wrote_behind ? ", wrote behind" : "")
         << (outcome.left_unended ? ", unended" : "") << (outcome.allocated ? ", allocated" : "")
         << ", " << outcome.blocks_left_behind << " blocks left behind}";
}

using Derivation = std::function<int(char* buffer, int size)>;

// Calls `derive` with a buffer of `size` + 1 bytes, canaries right behind them.
Outcome Observe(int size, const Derivation& derive) {
    const std::size_t room = size < 0 ? 1 : static_cast<std::size_t>(size) + 1;
    std::vector<char> buffer(room + kCanaries, kCanary);
    const int live_before = TakeAllocations().live;

    Outcome outcome;
    errno = kErrnoBefore;
    outcome.result = derive(buffer.data(), size);
    outcome.error = errno;

    const Allocations allocations = TakeAllocations();
    outcome.allocated = allocations.total != 0;
    outcome.blocks_left_behind = allocations.live - live_before;
    outcome.records = TakeRecords();
    const auto is_canary = [](char byte) { return byte == kCanary; };
    outcome.wrote = !std::all_of(buffer.begin(), buffer.end(), is_canary);
    if (!outcome.wrote) return outcome;
    const auto end = std::find(buffer.begin(), buffer.end(), '\0');
    outcome.left_unended = end == buffer.end();
    if (outcome.left_unended) return outcome;
    outcome.text.assign(buffer.begin(), end);
    outcome.wrote_behind = !std::all_of(end + 1, buffer.end(), is_canary);
    return outcome;
}

Outcome DirPath(int form, const std::string& path, int size = kRoom) {
    return Observe(size, [&](char* buffer, int room) {
        return MAVOEADirPath(form, path.c_str(), buffer, room);
    });
}

Outcome PathNoADFS(int form, const std::string& path, const std::string& kind, int size = kRoom) {
    return Observe(size, [&](char* buffer, int room) {
        return MAVOEAPathNoADFS(form, path.c_str(), kind.c_str(), buffer, room);
    });
}

Outcome ADPath(const std::string& path, int size = kRoom) {
    return Observe(
        size, [&](char* buffer, int room) { return MAVOEAADPath(path.c_str(), buffer, room); });
}

Outcome Path(int form, const std::string& path, const std::string& kind, int place,
             int size = kRoom) {
    return Observe(size, [&](char* buffer, int room) {
        return MAVOEAPath(form, path.c_str(), kind.c_str(), buffer, room, place);
    });
}

// Success with exactly this text, no record, and nothing written behind it.
Matcher<const Outcome&> Gives(const std::string& text) {
    return AllOf(Field("result", &Outcome::result, 0), Field("text", &Outcome::text, text),
                 Field("records", &Outcome::records, IsEmpty()),
                 Field("wrote", &Outcome::wrote, true),
                 Field("left_unended", &Outcome::left_unended, false),
                 Field("wrote_behind", &Outcome::wrote_behind, false),
                 Field("blocks_left_behind", &Outcome::blocks_left_behind, 0));
}

// Failure with one record and this errno; the buffer is as it was.
Matcher<const Outcome&> FailsWith(int code, const std::string& unit, int error) {
    return AllOf(Field("result", &Outcome::result, -1), Field("error", &Outcome::error, error),
                 Field("records", &Outcome::records, ElementsAre(RecordOf(code, unit))),
                 Field("wrote", &Outcome::wrote, false),
                 Field("blocks_left_behind", &Outcome::blocks_left_behind, 0));
}

// An absolute path of `length` bytes whose last component is short and does not end in '/'.
std::string PathOfLength(std::size_t length) {
    std::string path;
    for (std::size_t at = 0; at < length; ++at) path += at % 101 == 0 ? '/' : 'd';
    if (length > 1) path.back() = 'e';
    return path;
}

std::string As(std::size_t count) { return std::string(count, 'a'); }

// The 60 check characters by their ASCII codes.
std::string CheckTable() {
    std::string table;
    for (char digit = 0x31; digit <= 0x39; ++digit) table += digit;
    table += '\x30';
    for (char letter = 0x61; letter <= 0x7A; ++letter) table += letter;
    for (const int mark :
         {0x2D, 0x5F, 0x3D, 0x2B, 0x27, 0x3B, 0x5B, 0x5D, 0x7B, 0x7D, 0x7E, 0x60,
          0x2E, 0x21, 0x40, 0x23, 0x24, 0x25, 0x5E, 0x26, 0x2A, 0x28, 0x29, 0x20}) {
        table += static_cast<char>(mark);
    }
    return table;
}

// The check character of a name whose bytes from the 242nd on are `tail`.
char CheckOf(const std::string& tail) {
    int sum = 0;
    for (const char byte : tail) sum += static_cast<unsigned char>(byte);
    return CheckTable()[static_cast<std::size_t>(sum % 60)];
}

// The name under which the file form keeps the metadata of `name`, taken from a derived path.
std::string StoredName(const std::string& name) {
    const Outcome outcome = PathNoADFS(EA_FORM_FILE, "/v/" + name, MAVOEA_KIND_STREAM);
    EXPECT_EQ(0, outcome.result);
    const std::string head = "/v/@eaDir/";
    const std::string tail = "@MavoEAStream";
    if (outcome.text.size() < head.size() + tail.size()) return "(" + outcome.text + ")";
    EXPECT_EQ(head, outcome.text.substr(0, head.size()));
    EXPECT_EQ(tail, outcome.text.substr(outcome.text.size() - tail.size()));
    EXPECT_FALSE(outcome.wrote_behind);
    return outcome.text.substr(head.size(), outcome.text.size() - head.size() - tail.size());
}

// Whatever a test derives, the filesystem, the platform and the log are left alone.
class EaPathsTest : public ::testing::Test {
 protected:
    void SetUp() override {
        ResetPlatform();
        ResetKernel();
        live_ = TakeAllocations().live;
    }
    void TearDown() override {
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_THAT(TakePlatformCalls(), IsEmpty());
        EXPECT_THAT(TakeCallNames(), IsEmpty());
        EXPECT_EQ(live_, TakeAllocations().live);
    }

 private:
    int live_ = 0;
};

class EaDirPathTest : public EaPathsTest {};
class EaPathTest : public EaPathsTest {};
class EaAdPathTest : public EaPathsTest {};
class EaShortenedNameTest : public EaPathsTest {};
class EaPathPlaceTest : public EaPathsTest {};
class EaPathPropertyTest : public EaPathsTest {};

// ---- The EA directory ---------------------------------------------------------------------------

// Promise: "MAVOEADirPath: The EA directory"
TEST_F(EaDirPathTest, FileFormGivesTheDirectoryThatHoldsTheMetadata) {
    EXPECT_THAT(DirPath(1, "/v/share/a.txt"), Gives("/v/share/@eaDir"));
    EXPECT_THAT(DirPath(1, "/a"), Gives("/@eaDir"));
    EXPECT_THAT(DirPath(1, "/v/@eaDir/a"), Gives("/v/@eaDir/@eaDir"));
}

// Promise: "MAVOEADirPath: in EA_FORM_FOLDER"
TEST_F(EaDirPathTest, FolderFormGivesTheLegacyFolderOfTheObject) {
    EXPECT_THAT(DirPath(0, "/v/share/dir/"), Gives("/v/share/@eaDir/dir"));
    EXPECT_THAT(DirPath(0, "/v/share/a.txt"), Gives("/v/share/@eaDir/a.txt"));
    EXPECT_THAT(DirPath(0, "/a"), Gives("/@eaDir/a"));
}

TEST_F(EaDirPathTest, AnyFormOtherThanFolderIsFileForm) {
    for (const int form : {1, 2, 3, -1, INT_MAX, INT_MIN}) {
        SCOPED_TRACE(form);
        EXPECT_THAT(DirPath(form, "/v/share/a.txt"), Gives("/v/share/@eaDir"));
    }
}

TEST_F(EaDirPathTest, PathOfOneNameIsRelativeToTheCurrentDirectory) {
    EXPECT_THAT(DirPath(1, "a.txt"), Gives("@eaDir"));
    EXPECT_THAT(DirPath(0, "a.txt"), Gives("@eaDir/a.txt"));
    EXPECT_THAT(DirPath(1, "dir/"), Gives("@eaDir"));
    EXPECT_THAT(DirPath(0, "dir/"), Gives("@eaDir/dir"));
    EXPECT_THAT(DirPath(1, "share/a.txt"), Gives("share/@eaDir"));
}

// Promise: "Paths: One trailing '/'"
TEST_F(EaDirPathTest, OneTrailingSlashIsIgnoredAndNoMore) {
    EXPECT_THAT(DirPath(1, "/v/share/dir"), Gives("/v/share/@eaDir"));
    EXPECT_THAT(DirPath(1, "/v/share/dir/"), Gives("/v/share/@eaDir"));
    EXPECT_THAT(DirPath(1, "/v/share/dir//"), Gives("/v/share/dir/@eaDir"));
    EXPECT_THAT(DirPath(1, "/v/share/dir///"), Gives("/v/share/dir//@eaDir"));
    EXPECT_THAT(DirPath(0, "/v/share/dir"), Gives("/v/share/@eaDir/dir"));
    EXPECT_THAT(DirPath(0, "/v/share/dir//"), Gives("/v/share/dir/@eaDir/"));
    EXPECT_THAT(DirPath(0, "//v//dir"), Gives("//v//@eaDir/dir"));
}

TEST_F(EaDirPathTest, TheRootIsAnEmptyNameInTheCurrentDirectory) {
    EXPECT_THAT(DirPath(1, "/"), Gives("@eaDir"));
    EXPECT_THAT(DirPath(0, "/"), Gives("@eaDir/"));
    EXPECT_THAT(DirPath(1, "//"), Gives("/@eaDir"));
    EXPECT_THAT(DirPath(0, "//"), Gives("/@eaDir/"));
}

// Promise: "Paths: Codes: 0xD00 NULL"
// Promise: "MAVOEADirPath: errno"
TEST_F(EaDirPathTest, MissingArgumentsAreRefusedWithEnoent) {
    for (const int form : {0, 1}) {
        SCOPED_TRACE(form);
        EXPECT_THAT(
            Observe(kRoom, [&](char* buffer,
                               int size) { return MAVOEADirPath(form, nullptr, buffer, size); }),
            FailsWith(0xD00, "ea_dir_path", ENOENT));
        EXPECT_THAT(
            Observe(kRoom,
                    [&](char*, int size) { return MAVOEADirPath(form, "/v/a", nullptr, size); }),
            FailsWith(0xD00, "ea_dir_path", ENOENT));
        EXPECT_THAT(
            Observe(kRoom,
                    [&](char*, int size) { return MAVOEADirPath(form, nullptr, nullptr, size); }),
            FailsWith(0xD00, "ea_dir_path", ENOENT));
        EXPECT_THAT(DirPath(form, ""), FailsWith(0xD00, "ea_dir_path", ENOENT));
    }
}

TEST_F(EaDirPathTest, ArgumentsAreCheckedBeforeTheSizeOfTheBuffer) {
    EXPECT_THAT(DirPath(1, "", 0), FailsWith(0xD00, "ea_dir_path", ENOENT));
    EXPECT_THAT(Observe(0, [](char*, int size) { return MAVOEADirPath(1, "/v/a", nullptr, size); }),
                FailsWith(0xD00, "ea_dir_path", ENOENT));
}

// Promise: "Paths: Buffers."
TEST_F(EaDirPathTest, ResultOfExactlyTheSizeOfTheBufferPasses) {
    // 4 + 7 bytes are the longest result, whatever the form.
    EXPECT_THAT(DirPath(0, "/v/a", 11), Gives("/v/@eaDir/a"));
    EXPECT_THAT(DirPath(0, "/v/a", 10), FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
    EXPECT_THAT(DirPath(1, "/v/a", 11), Gives("/v/@eaDir"));
    EXPECT_THAT(DirPath(1, "/v/a", 10), FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
    EXPECT_THAT(DirPath(1, "a", 8), Gives("@eaDir"));
    EXPECT_THAT(DirPath(1, "a", 7), FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
}

TEST_F(EaDirPathTest, LengthCheckCountsTheTrailingSlash) {
    EXPECT_THAT(DirPath(0, "/v/d/", 12), Gives("/v/@eaDir/d"));
    EXPECT_THAT(DirPath(0, "/v/d/", 11), FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
}

// Promise: "Paths: 0xC300"
// Promise: "MAVOEADirPath: errno"
// Promise: "Paths: All return 0 or -1"
TEST_F(EaDirPathTest, BufferWithoutRoomIsTooSmallForEverything) {
    for (const int size : {7, 1, 0, -1, INT_MIN}) {
        SCOPED_TRACE(size);
        EXPECT_THAT(DirPath(1, "a", size), FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
        EXPECT_THAT(DirPath(0, "/", size), FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
    }
}

TEST_F(EaDirPathTest, NoResultPasses4095BytesHoweverLargeTheBuffer) {
    const std::string longest = PathOfLength(4088);
    const auto slash = longest.rfind('/');
    const std::string parent = longest.substr(0, slash + 1);
    const std::string name = longest.substr(slash + 1);
    EXPECT_THAT(DirPath(0, longest, kEndless), Gives(parent + "@eaDir/" + name));
    EXPECT_THAT(DirPath(1, longest, kEndless), Gives(parent + "@eaDir"));
    EXPECT_THAT(DirPath(0, longest, 4095), Gives(parent + "@eaDir/" + name));
    EXPECT_EQ(4095U, DirPath(0, longest, 4095).text.size());
    for (const int form : {0, 1}) {
        EXPECT_THAT(DirPath(form, PathOfLength(4089), kEndless),
                    FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
        EXPECT_THAT(DirPath(form, longest + "/", kEndless),
                    FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
        EXPECT_THAT(DirPath(form, longest, 4094), FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
    }
}

// Promise: "Paths: 0x200 out of memory"
TEST_F(EaDirPathTest, PathsUpTo4094BytesAllocateNothing) {
    EXPECT_FALSE(DirPath(0, "/v/share/a.txt").allocated);
    EXPECT_FALSE(DirPath(1, PathOfLength(4088)).allocated);
    const FailCall fault("malloc", ENOMEM, 0);
    EXPECT_EQ(0, DirPath(1, PathOfLength(4088)).result);
    EXPECT_THAT(DirPath(1, PathOfLength(4094), kEndless),
                FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
    EXPECT_FALSE(fault.fired());
}

// Promise: "Paths: 0x200 out of memory"
TEST_F(EaDirPathTest, PathOver4094BytesNeedsMemoryBeforeItIsRefused) {
    for (const std::size_t length : {std::size_t{4095}, std::size_t{4096}, std::size_t{9000}}) {
        SCOPED_TRACE(length);
        EXPECT_THAT(DirPath(1, PathOfLength(length), kEndless),
                    FailsWith(0xC300, "ea_dir_path", ENAMETOOLONG));
        const FailCall fault("malloc", kErrnoBefore);
        EXPECT_THAT(DirPath(1, PathOfLength(length), kEndless),
                    FailsWith(0x200, "ea_dir_path", kErrnoBefore));
        EXPECT_TRUE(fault.fired());
    }
}

TEST_F(EaDirPathTest, LongNamesAreNeverShortened) {
    EXPECT_THAT(DirPath(0, "/v/" + As(243)), Gives("/v/@eaDir/" + As(243)));
    EXPECT_THAT(DirPath(0, "/v/" + As(3000) + ".txt"), Gives("/v/@eaDir/" + As(3000) + ".txt"));
    EXPECT_THAT(DirPath(1, "/v/" + As(3000)), Gives("/v/@eaDir"));
}

// ---- Metadata files in the EA directory ---------------------------------------------------------

// Promise: "EA_FORM_FILE"
// Promise: "MAVOEAPathNoADFS: The metadata file"
// Promise: "Where metadata lies: `D/@eaDir/N@MavoEAStream`"
TEST_F(EaPathTest, FileFormGivesNameAtKind) {
    EXPECT_THAT(PathNoADFS(1, "/v/share/a.txt", "MavoEAStream"),
                Gives("/v/share/@eaDir/a.txt@MavoEAStream"));
    EXPECT_THAT(PathNoADFS(1, "/v/share/a.txt", "MavoResource"),
                Gives("/v/share/@eaDir/a.txt@MavoResource"));
    EXPECT_THAT(PathNoADFS(1, "/a", "MavoResourceTmp"), Gives("/@eaDir/a@MavoResourceTmp"));
}

// Promise: "EA_FORM_FOLDER"
// Promise: "MAVOEAPathNoADFS: The metadata file"
TEST_F(EaPathTest, FolderFormGivesAFileInTheFolderOfTheObject) {
    EXPECT_THAT(PathNoADFS(0, "/v/share/a.txt", "MAVO:Resource"),
                Gives("/v/share/@eaDir/a.txt/MAVO:Resource"));
    EXPECT_THAT(PathNoADFS(0, "/v/share/a.txt", "user.x"), Gives("/v/share/@eaDir/a.txt/user.x"));
}

// Promise: "MAVOEAPathNoADFS: The metadata file"
TEST_F(EaPathTest, AnyOtherFormGivesTheKindAlone) {
    for (const int form : {2, 3, -1, INT_MAX, INT_MIN}) {
        SCOPED_TRACE(form);
        EXPECT_THAT(PathNoADFS(form, "/v/share/a.txt", "MavoEAStream"),
                    Gives("/v/share/@eaDir/MavoEAStream"));
        EXPECT_THAT(PathNoADFS(form, "a", "k"), Gives("@eaDir/k"));
    }
}

TEST_F(EaPathTest, PathOfOneNameIsRelativeToTheCurrentDirectory) {
    EXPECT_THAT(PathNoADFS(1, "a.txt", "k"), Gives("@eaDir/a.txt@k"));
    EXPECT_THAT(PathNoADFS(0, "a.txt", "k"), Gives("@eaDir/a.txt/k"));
    EXPECT_THAT(PathNoADFS(1, "dir/", "k"), Gives("@eaDir/dir@k"));
    EXPECT_THAT(PathNoADFS(1, As(243), "k"), Gives("@eaDir/" + As(241) + CheckOf("aa") + "@k"));
}

// Promise: "Paths: One trailing '/'"
TEST_F(EaPathTest, OneTrailingSlashIsIgnored) {
    EXPECT_THAT(PathNoADFS(1, "/v/share/dir", "k"), Gives("/v/share/@eaDir/dir@k"));
    EXPECT_THAT(PathNoADFS(1, "/v/share/dir/", "k"), Gives("/v/share/@eaDir/dir@k"));
    EXPECT_THAT(PathNoADFS(0, "/v/share/dir", "k"), Gives("/v/share/@eaDir/dir/k"));
    EXPECT_THAT(PathNoADFS(0, "/v/share/dir/", "k"), Gives("/v/share/@eaDir/dir/k"));
    EXPECT_THAT(PathNoADFS(2, "/v/share/dir/", "k"), Gives("/v/share/@eaDir/k"));
}

// The name is empty, as one '/' is left; the directory is derived from the path without it, which
// takes the other '/' for the one that is ignored.
TEST_F(EaPathTest, TwoTrailingSlashesMakeAnEmptyName) {
    EXPECT_THAT(PathNoADFS(1, "/v/share/dir//", "k"), Gives("/v/share/@eaDir/@k"));
    EXPECT_THAT(PathNoADFS(0, "/v/share/dir//", "k"), Gives("/v/share/@eaDir/dir/k"));
    EXPECT_THAT(PathNoADFS(2, "/v/share/dir//", "k"), Gives("/v/share/@eaDir/k"));
    EXPECT_THAT(PathNoADFS(1, "/v/share/dir///", "k"), Gives("/v/share/dir/@eaDir/@k"));
    EXPECT_THAT(PathNoADFS(1, "//", "k"), Gives("@eaDir/@k"));
}

// Without its trailing slash the root is an empty path, which has no EA directory.
TEST_F(EaPathTest, TheRootHasNoMetadataFile) {
    for (const int form : {0, 1, 2, -1}) {
        SCOPED_TRACE(form);
        EXPECT_THAT(PathNoADFS(form, "/", "k"), FailsWith(0xD00, "ea_dir_path", ENOENT));
    }
}

TEST_F(EaPathTest, EmptyKindIsAKindLikeAnyOther) {
    EXPECT_THAT(PathNoADFS(1, "/v/a", ""), Gives("/v/@eaDir/a@"));
    EXPECT_THAT(PathNoADFS(0, "/v/a", ""), Gives("/v/@eaDir/a/"));
    EXPECT_THAT(PathNoADFS(2, "/v/a", ""), Gives("/v/@eaDir/"));
}

// Promise: "Paths: Codes: 0xD00 NULL"
TEST_F(EaPathTest, MissingArgumentsAreRefusedAndErrnoIsLeftAlone) {
    for (const int form : {0, 1, 2}) {
        SCOPED_TRACE(form);
        EXPECT_THAT(Observe(kRoom,
                            [&](char* buffer, int size) {
                                return MAVOEAPathNoADFS(form, nullptr, "k", buffer, size);
                            }),
                    FailsWith(0xD00, "ea_path", kErrnoBefore));
        EXPECT_THAT(Observe(kRoom,
                            [&](char* buffer, int size) {
                                return MAVOEAPathNoADFS(form, "/v/a", nullptr, buffer, size);
                            }),
                    FailsWith(0xD00, "ea_path", kErrnoBefore));
        EXPECT_THAT(PathNoADFS(form, "", "k"), FailsWith(0xD00, "ea_path", kErrnoBefore));
        EXPECT_THAT(PathNoADFS(form, "", "k", 0), FailsWith(0xD00, "ea_path", kErrnoBefore));
    }
}

TEST_F(EaPathTest, MissingBufferIsFoundByTheDirectoryDerivation) {
    for (const int form : {0, 1, 2}) {
        SCOPED_TRACE(form);
        EXPECT_THAT(Observe(kRoom,
                            [&](char*, int size) {
                                return MAVOEAPathNoADFS(form, "/v/a", "k", nullptr, size);
                            }),
                    FailsWith(0xD00, "ea_dir_path", ENOENT));
        EXPECT_THAT(Observe(4,
                            [&](char*, int size) {
                                return MAVOEAPathNoADFS(form, "/v/a", "k", nullptr, size);
                            }),
                    FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    }
}

// Promise: "Paths: Buffers."
TEST_F(EaPathTest, FileFormNeedsRoomForItsTerminatingNul) {
    // "/v/@eaDir/a@kind" has 16 bytes.
    EXPECT_THAT(PathNoADFS(1, "/v/a", "kind", 17), Gives("/v/@eaDir/a@kind"));
    EXPECT_THAT(PathNoADFS(1, "/v/a", "kind", 16), FailsWith(0xC300, "ea_path", ENAMETOOLONG));
}

// Promise: "Paths: Buffers."
TEST_F(EaPathTest, OtherFormsPassWithoutRoomForTheirTerminatingNul) {
    EXPECT_THAT(PathNoADFS(0, "/v/a", "kind", 16), Gives("/v/@eaDir/a/kind"));
    EXPECT_THAT(PathNoADFS(0, "/v/a", "kind", 15), FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    for (const int form : {2, -1}) {
        SCOPED_TRACE(form);
        EXPECT_THAT(PathNoADFS(form, "/v/a", "kind", 16), Gives("/v/@eaDir/kind"));
        EXPECT_THAT(PathNoADFS(form, "/v/a", "kind", 15),
                    FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    }
}

TEST_F(EaPathTest, FileFormWritesNoMoreThanTheSizeOfTheBuffer) {
    // One byte less than Observe() offers: the last byte of the buffer is a canary, too.
    std::vector<char> buffer(17 + 1, kCanary);
    ASSERT_EQ(0, MAVOEAPathNoADFS(1, "/v/a", "kind", buffer.data(), 17));
    EXPECT_STREQ("/v/@eaDir/a@kind", buffer.data());
    EXPECT_EQ(kCanary, buffer[17]);
}

TEST_F(EaPathTest, LengthCheckDoesNotCountTheTrailingSlash) {
    EXPECT_THAT(PathNoADFS(1, "/v/d/", "kind", 17), Gives("/v/@eaDir/d@kind"));
    EXPECT_THAT(PathNoADFS(1, "/v/d/", "kind", 16), FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    EXPECT_THAT(PathNoADFS(0, "/v/d/", "kind", 16), Gives("/v/@eaDir/d/kind"));
    EXPECT_THAT(PathNoADFS(0, "/v/d/", "kind", 15), FailsWith(0xC300, "ea_path", ENAMETOOLONG));
}

TEST_F(EaPathTest, LengthCheckCountsTheNameBeforeItIsShortened) {
    const std::string path = "/" + As(300);
    EXPECT_THAT(PathNoADFS(1, path, "kind", 301 + 4 + 9),
                Gives("/@eaDir/" + As(241) + CheckOf(As(59)) + "@kind"));
    EXPECT_THAT(PathNoADFS(1, path, "kind", 301 + 4 + 8),
                FailsWith(0xC300, "ea_path", ENAMETOOLONG));
}

// Promise: "Paths: 0xC300"
// Promise: "MAVOEAPathNoADFS: errno"
TEST_F(EaPathTest, BufferWithoutRoomIsTooSmallForEverything) {
    for (const int form : {0, 1, 2}) {
        for (const int size : {8, 1, 0, -1, INT_MIN}) {
            SCOPED_TRACE(size);
            EXPECT_THAT(PathNoADFS(form, "a", "k", size),
                        FailsWith(0xC300, "ea_path", ENAMETOOLONG));
        }
    }
}

TEST_F(EaPathTest, NoPathNeedsMoreThan4096BytesHoweverLargeTheBuffer) {
    const std::string kind = "MavoEAStream";
    for (const int form : {0, 1, 2, -1}) {
        SCOPED_TRACE(form);
        const std::size_t overhead = kind.size() + (form == 1 ? 9 : 8);
        const std::string longest = PathOfLength(4096 - overhead);
        const auto slash = longest.rfind('/');
        const std::string name = longest.substr(slash + 1);
        const std::string middle = form == 1 ? name + "@" : form == 0 ? name + "/" : "";
        const std::string expected = longest.substr(0, slash + 1) + "@eaDir/" + middle + kind;
        EXPECT_THAT(PathNoADFS(form, longest, kind, kEndless), Gives(expected));
        EXPECT_THAT(PathNoADFS(form, longest + "/", kind, kEndless), Gives(expected));
        EXPECT_THAT(PathNoADFS(form, longest, kind, 4096), Gives(expected));
        EXPECT_THAT(PathNoADFS(form, longest, kind, 4095),
                    FailsWith(0xC300, "ea_path", ENAMETOOLONG));
        EXPECT_THAT(PathNoADFS(form, PathOfLength(4097 - overhead), kind, kEndless),
                    FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    }
}

TEST_F(EaPathTest, LongestPathWithAnEmptyKindPassesBothLengthChecks) {
    const std::string longest = PathOfLength(4088);
    const auto slash = longest.rfind('/');
    EXPECT_THAT(PathNoADFS(0, longest, "", kEndless),
                Gives(longest.substr(0, slash) + "/@eaDir" + longest.substr(slash) + "/"));
    EXPECT_THAT(PathNoADFS(0, PathOfLength(4089), "", kEndless),
                FailsWith(0xC300, "ea_path", ENAMETOOLONG));
}

TEST_F(EaPathTest, VeryLongKindIsRefused) {
    for (const int form : {0, 1, 2}) {
        EXPECT_THAT(PathNoADFS(form, "/v/a", As(10000), kEndless),
                    FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    }
}

// Promise: "Paths: 0x200 out of memory"
TEST_F(EaPathTest, PathsUpTo4094BytesAllocateNothing) {
    const FailCall fault("malloc", ENOMEM, 0);
    EXPECT_THAT(PathNoADFS(1, "/v/share/a.txt", "k"), Gives("/v/share/@eaDir/a.txt@k"));
    EXPECT_EQ(0, PathNoADFS(1, "/v/" + As(3000) + ".txt", "k").result);
    EXPECT_EQ(0, PathNoADFS(1, PathOfLength(4086), "k", kEndless).result);
    EXPECT_THAT(PathNoADFS(1, PathOfLength(4094), "k", kEndless),
                FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    EXPECT_FALSE(fault.fired());
}

// Promise: "Paths: 0x200 out of memory"
TEST_F(EaPathTest, PathOver4094BytesNeedsMemoryBeforeItIsRefused) {
    for (const int form : {0, 1, 2}) {
        for (const std::size_t length : {std::size_t{4095}, std::size_t{4096}, std::size_t{9000}}) {
            SCOPED_TRACE(length);
            EXPECT_THAT(PathNoADFS(form, PathOfLength(length), "k", kEndless),
                        FailsWith(0xC300, "ea_path", ENAMETOOLONG));
            const FailCall fault("malloc", kErrnoBefore);
            EXPECT_THAT(PathNoADFS(form, PathOfLength(length), "k", kEndless),
                        FailsWith(0x200, "ea_path", kErrnoBefore));
            EXPECT_TRUE(fault.fired());
        }
    }
}

TEST_F(EaPathTest, TheSlashOfAPathOf4095BytesCountsForItsMemory) {
    const std::string path = PathOfLength(4094) + "/";
    const FailCall fault("malloc", kErrnoBefore);
    EXPECT_THAT(PathNoADFS(1, path, "k"), FailsWith(0x200, "ea_path", kErrnoBefore));
}

// ---- Names that are shortened -------------------------------------------------------------------

// Promise: "Where metadata lies: In the file names"
// Promise: "How long names can be: of an object as part"
TEST_F(EaShortenedNameTest, NameOf242BytesIsUsedUnchanged) {
    EXPECT_EQ(As(242), StoredName(As(242)));
    EXPECT_EQ(As(238) + ".txt", StoredName(As(238) + ".txt"));
    EXPECT_EQ(std::string(242, '.'), StoredName(std::string(242, '.')));
}

// Promise: "Paths: In EA_FORM_FILE a name of more than 242"
// Promise: "Where metadata lies: In the file names"
// Promise: "How long names can be: of an object as part"
TEST_F(EaShortenedNameTest, NameOf243BytesEndsInItsCheckCharacter) {
    // 'a' + 'a' is 194, index 14: 'e'.
    EXPECT_EQ(As(241) + "e", StoredName(As(243)));
    // "xt" is 236, index 56: '*', which stands before the extension.
    EXPECT_EQ(As(237) + "*.txt", StoredName(As(239) + ".txt"));
}

// Promise: "Where metadata lies: In the file names"
TEST_F(EaShortenedNameTest, SumRunsFromThe242ndByteToTheEndOfTheExtension) {
    // "bc.txt" is 98 + 99 + 46 + 116 + 120 + 116 = 595, index 55: '&'.
    EXPECT_EQ(As(237) + "&.txt", StoredName(As(241) + "bc.txt"));
    // The 241st byte is not in the sum, the 242nd is.
    EXPECT_EQ(As(240) + "be", StoredName(As(240) + "baa"));
    EXPECT_EQ(As(241) + "f", StoredName(As(241) + "ba"));
}

TEST_F(EaShortenedNameTest, DotMoreThanSixBytesFromTheEndMakesNoExtension) {
    // ".sixsix" has 7 bytes. The sum of "aaa.sixsix" is 3 * 97 + 46 + 2 * (115 + 105 + 120) = 1017,
    // index 57: '('.
    EXPECT_EQ(As(241) + "(", StoredName(As(244) + ".sixsix"));
    EXPECT_EQ("." + As(240) + "e", StoredName("." + As(242)));
}

// Promise: "Where metadata lies: In the file names"
TEST_F(EaShortenedNameTest, ExtensionsOfOneToSixBytesAreKept) {
    for (std::size_t length = 1; length <= 6; ++length) {
        SCOPED_TRACE(length);
        const std::string extension = "." + std::string("vwxyz").substr(0, length - 1);
        for (const std::size_t stem : {243 - length, 250 - length, std::size_t{900}}) {
            const std::string name = As(stem) + extension;
            const std::string expected = As(241 - length) + CheckOf(name.substr(241)) + extension;
            EXPECT_EQ(expected, StoredName(name));
            EXPECT_EQ(242U, StoredName(name).size());
        }
    }
}

// Promise: "Where metadata lies: In the file names"
TEST_F(EaShortenedNameTest, ExtensionOfSevenBytesIsNotKept) {
    for (const std::size_t stem : {std::size_t{236}, std::size_t{243}, std::size_t{900}}) {
        const std::string name = As(stem) + ".uvwxyz";
        EXPECT_EQ(name.substr(0, 241) + CheckOf(name.substr(241)), StoredName(name));
    }
}

TEST_F(EaShortenedNameTest, TheLastOfSeveralDotsBeginsTheExtension) {
    const struct {
        std::string name;
        std::string extension;
    } kCases[] = {
        {As(240) + "tar.gz.x", ".x"}, {As(243) + ".a.b", ".b"},
        {As(243) + "..", "."},        {As(243) + ".b..", "."},
        {As(243) + ".", "."},         {As(237) + ".abcdef.", "."},
        {As(238) + ".abcd.e", ".e"},  {As(100) + "." + As(200) + ".txt", ".txt"},
        {As(242) + ".txt", ".txt"},   {As(241) + ".txt", ".txt"},
        {std::string(243, '.'), "."}, {std::string(500, '.'), "."},
        {As(238) + "......", "."},
    };
    for (const auto& [name, extension] : kCases) {
        SCOPED_TRACE(name);
        const std::string expected =
            name.substr(0, 241 - extension.size()) + CheckOf(name.substr(241)) + extension;
        EXPECT_EQ(expected, StoredName(name));
    }
}

TEST_F(EaShortenedNameTest, DotsOfTheParentDoNotMatter) {
    EXPECT_THAT(PathNoADFS(1, "/v.x/..c/" + As(243), "k"),
                Gives("/v.x/..c/@eaDir/" + As(241) + "e@k"));
}

TEST_F(EaShortenedNameTest, EveryOneOfThe60CheckCharactersIsUsed) {
    const std::string table = CheckTable();
    ASSERT_EQ(60U, table.size());
    ASSERT_EQ("1234567890abcdefghijklmnopqrstuvwxyz-_=+';[]{}~`.!@#$%^&*() ", table);
    for (int index = 0; index < 60; ++index) {
        SCOPED_TRACE(index);
        // 'A' is 65; the byte behind it makes the rest: '0' (48) + 65 is 113, index 53.
        const char last = static_cast<char>('0' + (index + 60 - 53) % 60);
        const char expected = table[static_cast<std::size_t>(index)];
        EXPECT_EQ(As(241) + expected, StoredName(As(241) + "A" + last));
    }
}

TEST_F(EaShortenedNameTest, EveryOneOfThe60CheckCharactersStandsBeforeAnExtension) {
    const std::string table = CheckTable();
    for (int index = 0; index < 60; ++index) {
        SCOPED_TRACE(index);
        // ".z" is 168, index 48; '0' before it makes 216, index 36.
        const char first = static_cast<char>('0' + (index + 60 - 36) % 60);
        const char expected = table[static_cast<std::size_t>(index)];
        EXPECT_EQ(As(239) + expected + ".z", StoredName(As(241) + first + ".z"));
    }
}

TEST_F(EaShortenedNameTest, SpaceMayStandBeforeTheExtension) {
    // "Q.txt" is 81 + 398 = 479, index 59.
    EXPECT_EQ(As(237) + " .txt", StoredName(As(241) + "Q.txt"));
    // "QZD" is 81 + 90 + 68 = 239, index 59.
    EXPECT_EQ(As(241) + " ", StoredName(As(241) + "QZD"));
}

TEST_F(EaShortenedNameTest, DotMayBeTheCheckCharacter) {
    // "A+" is 65 + 43 = 108, index 48.
    EXPECT_EQ(As(241) + ".", StoredName(As(241) + "A+"));
}

TEST_F(EaShortenedNameTest, BytesAreSummedUnsigned) {
    // 0xFF + 0xFF is 510, index 30: 'u'.
    EXPECT_EQ(As(241) + "u", StoredName(As(241) + "\xFF\xFF"));
    // 0x80 + 'a' is 225, index 45: '}'.
    EXPECT_EQ(As(241) + "}", StoredName(As(241) + "\x80" + "a"));
    // 0xE3 0x81 0x82 is 486, index 6: '7'.
    EXPECT_EQ(As(241) + "7", StoredName(As(241) + "\xE3\x81\x82"));
    for (int byte = 1; byte <= 255; ++byte) {
        if (byte == '/' || byte == '.') continue;
        SCOPED_TRACE(byte);
        const char expected = CheckTable()[static_cast<std::size_t>((byte + 'a') % 60)];
        EXPECT_EQ(As(241) + expected, StoredName(As(241) + static_cast<char>(byte) + "a"));
    }
}

TEST_F(EaShortenedNameTest, SumOfALongNameDoesNotWrapAt16Bits) {
    // 3,000 bytes of 0xFF are 765,000, index 0; one more gives index 15.
    EXPECT_EQ(As(241) + "1", StoredName(As(241) + std::string(3000, '\xFF')));
    EXPECT_EQ(As(241) + "f", StoredName(As(241) + std::string(3001, '\xFF')));
}

// Promise: "Paths: In EA_FORM_FILE a name of more than 242"
// Promise: "How long names can be: of a file"
TEST_F(EaShortenedNameTest, StoredFileNameFitsInTheLimitOfAFilesystem) {
    for (const std::size_t length : {242U, 243U, 244U, 248U, 255U, 256U, 1000U, 4000U}) {
        SCOPED_TRACE(length);
        const std::string text = PathNoADFS(1, "/" + As(length - 4) + ".txt", "MavoEAStream").text;
        EXPECT_EQ(255U, text.size() - std::string("/@eaDir/").size());
    }
}

TEST_F(EaShortenedNameTest, KindDoesNotChangeTheLimit) {
    EXPECT_THAT(PathNoADFS(1, "/" + As(242), "k"), Gives("/@eaDir/" + As(242) + "@k"));
    EXPECT_THAT(PathNoADFS(1, "/" + As(243), "k"), Gives("/@eaDir/" + As(241) + "e@k"));
    EXPECT_THAT(PathNoADFS(1, "/" + As(242), "MavoResourceTmp"),
                Gives("/@eaDir/" + As(242) + "@MavoResourceTmp"));
}

TEST_F(EaShortenedNameTest, TrailingSlashIsNotPartOfTheName) {
    EXPECT_THAT(PathNoADFS(1, "/" + As(242) + "/", "k"), Gives("/@eaDir/" + As(242) + "@k"));
    EXPECT_THAT(PathNoADFS(1, "/" + As(239) + ".txt/", "k"),
                Gives("/@eaDir/" + As(237) + "*.txt@k"));
}

TEST_F(EaShortenedNameTest, OnlyTheFileFormShortens) {
    const std::string name = As(300) + ".txt";
    EXPECT_THAT(PathNoADFS(0, "/v/" + name, "k"), Gives("/v/@eaDir/" + name + "/k"));
    EXPECT_THAT(PathNoADFS(2, "/v/" + name, "k"), Gives("/v/@eaDir/k"));
    EXPECT_THAT(PathNoADFS(0, "/v/" + name, "k", 304), FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    EXPECT_THAT(PathNoADFS(1, "/" + name + "/b", "k"), Gives("/" + name + "/@eaDir/b@k"));
}

// ---- The AppleDouble file -----------------------------------------------------------------------

// Promise: "MAVOEAADPath: The AppleDouble file"
// Promise: "Where metadata lies: `D/._N`"
TEST_F(EaAdPathTest, StandsBesideTheObject) {
    EXPECT_THAT(ADPath("/a.txt"), Gives("/._a.txt"));
    EXPECT_THAT(ADPath("/v/share/a.txt"), Gives("/v/share/._a.txt"));
    EXPECT_THAT(ADPath("/v/share/._a"), Gives("/v/share/._._a"));
    EXPECT_THAT(ADPath("a.txt"), Gives("._a.txt"));
    EXPECT_THAT(ADPath("share/a.txt"), Gives("share/._a.txt"));
}

// Promise: "Paths: One trailing '/'"
TEST_F(EaAdPathTest, OneTrailingSlashIsIgnoredAndNoMore) {
    EXPECT_THAT(ADPath("/v/share/dir"), Gives("/v/share/._dir"));
    EXPECT_THAT(ADPath("/v/share/dir/"), Gives("/v/share/._dir"));
    EXPECT_THAT(ADPath("dir/"), Gives("._dir"));
    EXPECT_THAT(ADPath("/v/share/dir//"), Gives("/v/share/dir/._"));
    EXPECT_THAT(ADPath("/v//dir"), Gives("/v//._dir"));
}

// Promise: "Paths: Codes: 0xD00 NULL"
TEST_F(EaAdPathTest, EmptyPathAndRootGiveTheBarePrefix) {
    EXPECT_THAT(ADPath(""), Gives("._"));
    EXPECT_THAT(ADPath("/"), Gives("._"));
    EXPECT_THAT(ADPath("//"), Gives("/._"));
}

// Promise: "MAVOEAADPath: a name of more than 253"
// Promise: "MAVOEAADPath: errno is left alone"
TEST_F(EaAdPathTest, MissingArgumentsAreRefusedAndErrnoIsLeftAlone) {
    EXPECT_THAT(
        Observe(kRoom, [](char* buffer, int size) { return MAVOEAADPath(nullptr, buffer, size); }),
        FailsWith(0xD00, "ea_adpath", kErrnoBefore));
    EXPECT_THAT(Observe(kRoom, [](char*, int size) { return MAVOEAADPath("/v/a", nullptr, size); }),
                FailsWith(0xD00, "ea_adpath", kErrnoBefore));
    for (const int size : {0, -1, INT_MIN}) {
        SCOPED_TRACE(size);
        EXPECT_THAT(ADPath("/v/a", size), FailsWith(0xD00, "ea_adpath", kErrnoBefore));
    }
}

// Promise: "MAVOEAADPath: a name of more than 253"
// Promise: "MAVOEAADPath: errno is left alone"
// Promise: "Paths: All return 0 or -1"
// Promise: "How long names can be: of an object with"
TEST_F(EaAdPathTest, NameOf253BytesIsTheLongest) {
    EXPECT_THAT(ADPath("/v/" + As(253)), Gives("/v/._" + As(253)));
    EXPECT_THAT(ADPath(As(253)), Gives("._" + As(253)));
    EXPECT_THAT(ADPath("/v/" + As(254)), FailsWith(0xC300, "ea_adpath", kErrnoBefore));
    EXPECT_THAT(ADPath("/v/" + As(254), kEndless), FailsWith(0xC300, "ea_adpath", kErrnoBefore));
    EXPECT_THAT(ADPath(As(254)), FailsWith(0xC300, "ea_adpath", kErrnoBefore));
    EXPECT_THAT(ADPath("/v/" + As(254), 1), FailsWith(0xC300, "ea_adpath", kErrnoBefore));
    EXPECT_THAT(ADPath("/" + As(254) + "/b"), Gives("/" + As(254) + "/._b"));
}

// The name that is measured is empty behind a trailing slash; the one that is used is not.
TEST_F(EaAdPathTest, TrailingSlashHidesALongNameFromTheLengthCheck) {
    EXPECT_THAT(ADPath("/v/" + As(254) + "/"), Gives("/v/._" + As(254)));
    EXPECT_THAT(ADPath(As(400) + "/"), Gives("._" + As(400)));
}

// Promise: "MAVOEAADPath: A result longer"
TEST_F(EaAdPathTest, ResultThatDoesNotFitIsCutShort) {
    const std::string whole = "/v/._a.txt";
    for (int size = 1; size <= 14; ++size) {
        SCOPED_TRACE(size);
        EXPECT_THAT(ADPath("/v/a.txt", size),
                    Gives(whole.substr(0, static_cast<std::size_t>(size - 1))));
    }
    EXPECT_THAT(ADPath("a.txt", 4), Gives("._a"));
    EXPECT_THAT(ADPath("a.txt", 2), Gives("."));
    EXPECT_THAT(ADPath("a.txt", 1), Gives(""));
}

TEST_F(EaAdPathTest, CutShortItWritesNoMoreThanTheSizeOfTheBuffer) {
    std::vector<char> buffer(6 + 1, kCanary);
    ASSERT_EQ(0, MAVOEAADPath("/v/a.txt", buffer.data(), 6));
    EXPECT_STREQ("/v/._", buffer.data());
    EXPECT_EQ(kCanary, buffer[6]);
}

TEST_F(EaAdPathTest, PathsUpTo4094BytesAllocateNothing) {
    const std::string path = PathOfLength(4094);
    const FailCall fault("malloc", ENOMEM, 0);
    const auto slash = path.rfind('/');
    const std::string whole = path.substr(0, slash) + "/._" + path.substr(slash + 1);
    EXPECT_THAT(ADPath(path, kEndless), Gives(whole));
    EXPECT_THAT(ADPath(path), Gives(whole.substr(0, 4094)));
    EXPECT_FALSE(ADPath("/v/a").allocated);
    EXPECT_FALSE(fault.fired());
}

// Promise: "Paths: 0x200 out of memory"
// Promise: "MAVOEAADPath: errno is left alone"
TEST_F(EaAdPathTest, PathOver4094BytesNeedsMemory) {
    for (const std::size_t length : {std::size_t{4095}, std::size_t{4096}, std::size_t{9000}}) {
        SCOPED_TRACE(length);
        const std::string path = PathOfLength(length);
        const auto slash = path.rfind('/');
        const std::string whole = path.substr(0, slash) + "/._" + path.substr(slash + 1);
        EXPECT_THAT(ADPath(path, kEndless), Gives(whole));
        EXPECT_THAT(ADPath(path, 100), Gives(whole.substr(0, 99)));
        const FailCall fault("malloc", ENOMEM);
        EXPECT_THAT(ADPath(path, kEndless), FailsWith(0x200, "ea_adpath", ENOMEM));
        EXPECT_TRUE(fault.fired());
    }
}

TEST_F(EaAdPathTest, LongNameIsFoundBeforeMemoryIsNeeded) {
    const FailCall fault("malloc", ENOMEM, 0);
    EXPECT_THAT(ADPath(PathOfLength(4095) + As(254)), FailsWith(0xC300, "ea_adpath", kErrnoBefore));
    EXPECT_FALSE(fault.fired());
}

// ---- Places -------------------------------------------------------------------------------------

// Promise: "EA_PLACE_EADIR"
// Promise: "MAVOEAPath: MAVOEAPathNoADFS()"
TEST_F(EaPathPlaceTest, EaDirectoryPlaceLiesInTheEaDirectory) {
    EXPECT_THAT(Path(1, "/v/share/a.txt", "MavoEAStream", 0),
                Gives("/v/share/@eaDir/a.txt@MavoEAStream"));
    EXPECT_THAT(Path(0, "/v/share/a.txt", "MAVO:Resource", 0),
                Gives("/v/share/@eaDir/a.txt/MAVO:Resource"));
    EXPECT_THAT(Path(2, "/v/share/a.txt", "MavoEAStream", 0),
                Gives("/v/share/@eaDir/MavoEAStream"));
    EXPECT_THAT(Path(1, "/v/" + As(243), "k", 0), Gives("/v/@eaDir/" + As(241) + "e@k"));
}

// Promise: "EA_PLACE_APPLEDOUBLE"
// Promise: "MAVOEAPath: MAVOEAPathNoADFS()"
TEST_F(EaPathPlaceTest, AppleDoublePlaceIgnoresFormAndKind) {
    for (const int form : {0, 1, 2, -1}) {
        for (const std::string kind : {"MavoEAStream", "MavoResource", ""}) {
            EXPECT_THAT(Path(form, "/v/share/a.txt", kind, 1), Gives("/v/share/._a.txt"));
        }
    }
    EXPECT_THAT(Path(1, "", "k", 1), Gives("._"));
    EXPECT_THAT(Path(1, "/v/a", "k", 1, 5), Gives("/v/."));
}

// Promise: "MAVOEAPath: any other place"
TEST_F(EaPathPlaceTest, AnyOtherPlaceIsRefused) {
    for (const int place : {2, 3, -1, INT_MAX, INT_MIN}) {
        SCOPED_TRACE(place);
        EXPECT_THAT(Path(1, "/v/a", "k", place), FailsWith(0xD00, "ea_path", kErrnoBefore));
    }
}

// Promise: "MAVOEAPath: MAVOEAPathNoADFS()"
TEST_F(EaPathPlaceTest, MissingPathOrKindIsRefusedInEveryPlace) {
    for (const int place : {0, 1, 2}) {
        SCOPED_TRACE(place);
        EXPECT_THAT(Observe(kRoom,
                            [&](char* buffer, int size) {
                                return MAVOEAPath(1, nullptr, "k", buffer, size, place);
                            }),
                    FailsWith(0xD00, "ea_path", kErrnoBefore));
        EXPECT_THAT(Observe(kRoom,
                            [&](char* buffer, int size) {
                                return MAVOEAPath(1, "/v/a", nullptr, buffer, size, place);
                            }),
                    FailsWith(0xD00, "ea_path", kErrnoBefore));
    }
}

TEST_F(EaPathPlaceTest, FailuresOfThePlaceStandAsRecordedThere) {
    EXPECT_THAT(Path(1, "", "k", 0), FailsWith(0xD00, "ea_path", kErrnoBefore));
    EXPECT_THAT(Path(1, "/", "k", 0), FailsWith(0xD00, "ea_dir_path", ENOENT));
    EXPECT_THAT(Path(1, "/v/a", "k", 0, 13), FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    EXPECT_THAT(Path(0, "/v/a", "k", 0, 12), FailsWith(0xC300, "ea_path", ENAMETOOLONG));
    EXPECT_THAT(Path(1, "/v/" + As(254), "k", 1), FailsWith(0xC300, "ea_adpath", kErrnoBefore));
    EXPECT_THAT(Path(1, "/v/a", "k", 1, 0), FailsWith(0xD00, "ea_adpath", kErrnoBefore));
    const auto without_buffer = [](int place) {
        return Observe(kRoom, [&](char*, int size) {
            return MAVOEAPath(1, "/v/a", "k", nullptr, size, place);
        });
    };
    EXPECT_THAT(without_buffer(0), FailsWith(0xD00, "ea_dir_path", ENOENT));
    EXPECT_THAT(without_buffer(1), FailsWith(0xD00, "ea_adpath", kErrnoBefore));
}

TEST_F(EaPathPlaceTest, MemoryFailuresOfThePlaceStandAsRecordedThere) {
    const std::string path = PathOfLength(4095);
    {
        const FailCall fault("malloc", kErrnoBefore);
        EXPECT_THAT(Path(1, path, "k", 0), FailsWith(0x200, "ea_path", kErrnoBefore));
    }
    const FailCall fault("malloc", kErrnoBefore);
    EXPECT_THAT(Path(1, path, "k", 1), FailsWith(0x200, "ea_adpath", kErrnoBefore));
}

TEST_F(EaPathPlaceTest, ConstantsHaveTheirValues) {
    EXPECT_EQ(0, EA_PLACE_EADIR);
    EXPECT_EQ(1, EA_PLACE_APPLEDOUBLE);
    EXPECT_EQ(0, EA_FORM_FOLDER);
    EXPECT_EQ(1, EA_FORM_FILE);
    EXPECT_STREQ("MavoEAStream", MAVOEA_KIND_STREAM);
    EXPECT_STREQ("MavoResource", MAVOEA_KIND_RESOURCE);
    EXPECT_STREQ("MAVO:Resource", MAVOEA_KIND_LEGACY_RESOURCE);
    EXPECT_EQ(0xD00, MAVOEA_ERR_BAD_ARGUMENT);
    EXPECT_EQ(0x200, MAVOEA_ERR_MEMORY);
    EXPECT_EQ(0xC300, MAVOEA_ERR_NAME_TOO_LONG);
}

// ---- The same, derived a second way -------------------------------------------------------------

// What a derivation should do. No error (0) in `error` means that errno is left alone.
struct Expected {
    int code = 0;  // 0: success
    std::string unit;
    int error = 0;
    std::string text;
};

std::pair<std::string, std::string> Split(const std::string& path) {
    const std::size_t slash = path.rfind('/');
    if (slash == std::string::npos) return {"", path};
    return {path.substr(0, slash + 1), path.substr(slash + 1)};
}

std::string WithoutOneSlash(std::string path) {
    if (!path.empty() && path.back() == '/') path.pop_back();
    return path;
}

Expected ModelDirPath(int form, const std::string& path, int size) {
    if (path.empty()) return {0xD00, "ea_dir_path", ENOENT, ""};
    const long long need = static_cast<long long>(path.size()) + 7;
    if (need > size || need > 4095) return {0xC300, "ea_dir_path", ENAMETOOLONG, ""};
    const auto [parent, name] = Split(WithoutOneSlash(path));
    std::string text = parent + "@eaDir";
    if (form == 0) text += "/" + name;
    return {0, "", 0, text};
}

std::string ModelShortened(const std::string& name) {
    if (name.size() <= 242) return name;
    const std::string last_six = name.substr(name.size() - 6);
    const std::size_t dot = last_six.rfind('.');
    const std::string extension = dot == std::string::npos ? "" : last_six.substr(dot);
    return name.substr(0, 242 - 1 - extension.size()) + CheckOf(name.substr(241)) + extension;
}

Expected ModelPathNoADFS(int form, const std::string& path, const std::string& kind, int size) {
    if (path.empty()) return {0xD00, "ea_path", 0, ""};
    const std::string copy = WithoutOneSlash(path);
    const long long need = static_cast<long long>(copy.size() + kind.size()) + (form == 1 ? 9 : 8);
    if (need > size || need > 4096) return {0xC300, "ea_path", ENAMETOOLONG, ""};
    const auto [parent, name] = Split(copy);
    const std::string stored = form == 1 ? ModelShortened(name) : name;
    Expected expected = ModelDirPath(form, parent + stored, size);
    if (expected.code != 0) return expected;
    expected.text += "/";
    if (form == 1) expected.text += stored + "@";
    expected.text += kind;
    return expected;
}

Expected ModelADPath(const std::string& path, int size) {
    if (size <= 0) return {0xD00, "ea_adpath", 0, ""};
    if (Split(path).second.size() > 253) return {0xC300, "ea_adpath", 0, ""};
    const auto [parent, name] = Split(WithoutOneSlash(path));
    return {0, "", 0, (parent + "._" + name).substr(0, static_cast<std::size_t>(size) - 1)};
}

Expected ModelPath(int form, const std::string& path, const std::string& kind, int place,
                   int size) {
    if (place == 1) return ModelADPath(path, size);
    if (place == 0) return ModelPathNoADFS(form, path, kind, size);
    return {0xD00, "ea_path", 0, ""};
}

Matcher<const Outcome&> Does(const Expected& expected) {
    if (expected.code == 0) return Gives(expected.text);
    return FailsWith(expected.code, expected.unit,
                     expected.error == 0 ? kErrnoBefore : expected.error);
}

// Paths, kinds and sizes at random, many of them near a limit. The same ones every time.
class Generator {
 public:
    int Below(int bound) { return static_cast<int>(random_() % static_cast<unsigned>(bound)); }

    int OneOf(const std::vector<int>& values) {
        return values[static_cast<std::size_t>(Below(static_cast<int>(values.size())))];
    }

    std::string Name(int length) {
        const int dots = OneOf({0, 1, 2, 5, 50});  // of 100 bytes
        const bool ascii = Below(2) == 0;
        std::string name;
        for (int i = 0; i < length; ++i) {
            char byte = static_cast<char>(ascii ? 0x20 + Below(95) : 1 + Below(255));
            if (byte == '/') byte = '0';
            name += Below(100) < dots ? '.' : byte;
        }
        return name;
    }

    std::string Path() {
        if (Below(50) == 0) return std::string(static_cast<std::size_t>(Below(4)), '/');
        std::string path = Below(3) == 0 ? "" : "/";
        for (int parents = Below(4); parents > 0; --parents) path += Name(Below(20)) + "/";
        if (Below(8) == 0) {  // Near the absolute limits.
            const int wanted = OneOf({4060, 4075, 4085, 4090, 4096, 4100}) + Below(8);
            const int parent = wanted - static_cast<int>(path.size()) - Below(260) - 1;
            path += Name(parent) + "/";
            path += Name(wanted - static_cast<int>(path.size()));
        } else {
            path += Name(OneOf({Below(30), 236 + Below(24), Below(600)}));
        }
        for (int slashes = OneOf({0, 0, 0, 1, 1, 2, 3}); slashes > 0; --slashes) path += '/';
        return path;
    }

    std::string Kind() {
        switch (Below(4)) {
            case 0:
                return "MavoEAStream";
            case 1:
                return "MavoResource";
            case 2:
                return "MAVO:Resource";
            default:
                return Name(Below(40));
        }
    }

    // Roomy, or close to what `path` and `kind` need.
    int Size(const std::string& path, const std::string& kind) {
        switch (Below(3)) {
            case 0:
                return OneOf({4095, 4096, kEndless});
            case 1:
                return static_cast<int>(path.size() + kind.size()) + Below(14);
            default:
                return static_cast<int>(path.size()) + Below(12);
        }
    }

    int Form() { return OneOf({1, 1, 1, 0, 0, 2, -1}); }

 private:
    std::mt19937 random_{20};
};

TEST_F(EaPathPropertyTest, EveryPathIsDerivedAsAStraightforwardDerivationDoes) {
    Generator generate;
    for (int round = 0; round < 5000 / kSeriesStep; ++round) {
        SCOPED_TRACE(round);
        const std::string path = generate.Path();
        const std::string kind = generate.Kind();
        const int form = generate.Form();
        const int place = generate.OneOf({0, 0, 0, 1, 2});
        const int size = generate.Size(path, kind);
        ASSERT_THAT(DirPath(form, path, size), Does(ModelDirPath(form, path, size)));
        ASSERT_THAT(PathNoADFS(form, path, kind, size),
                    Does(ModelPathNoADFS(form, path, kind, size)));
        ASSERT_THAT(ADPath(path, size), Does(ModelADPath(path, size)));
        ASSERT_THAT(Path(form, path, kind, place, size),
                    Does(ModelPath(form, path, kind, place, size)));
    }
}

// Derives in the very buffer that holds the path, `lead` bytes in front of it. What stands in the
// buffer behind both the path and the result is checked for changes.
void ExpectInPlace(const std::string& path, std::size_t lead, int size, const Expected& expected,
                   const std::function<int(const char* path, char* buffer)>& derive) {
    const std::size_t room =
        std::max(lead + path.size(), static_cast<std::size_t>(size)) + 1 + kCanaries;
    std::vector<char> buffer(room, kCanary);
    char* const start = buffer.data();
    std::copy(path.c_str(), path.c_str() + path.size() + 1, start + lead);
    const std::vector<char> before = buffer;

    errno = kErrnoBefore;
    const int result = derive(start + lead, start);
    const int error = errno;
    const std::vector<Record> records = TakeRecords();
    if (expected.code != 0) {
        ASSERT_EQ(-1, result);
        ASSERT_EQ(expected.error == 0 ? kErrnoBefore : expected.error, error);
        ASSERT_THAT(records, ElementsAre(RecordOf(expected.code, expected.unit)));
        ASSERT_EQ(before, buffer);
        return;
    }
    ASSERT_EQ(0, result);
    ASSERT_THAT(records, IsEmpty());
    ASSERT_NE(buffer.end(), std::find(buffer.begin(), buffer.end(), '\0'));
    ASSERT_EQ(expected.text, std::string(start));
    const std::size_t used = std::max(lead + path.size(), expected.text.size()) + 1;
    ASSERT_TRUE(std::all_of(buffer.begin() + static_cast<ptrdiff_t>(used), buffer.end(),
                            [](char byte) { return byte == kCanary; }));
}

void ExpectAllInPlace(Generator& generate, std::size_t lead) {
    const std::string path = generate.Path();
    const std::string kind = generate.Kind();
    const int form = generate.Form();
    const int place = generate.OneOf({0, 1});
    const int size = generate.Size(path, kind);
    ExpectInPlace(path, lead, size, ModelDirPath(form, path, size),
                  [&](const char* in, char* out) { return MAVOEADirPath(form, in, out, size); });
    ExpectInPlace(path, lead, size, ModelPathNoADFS(form, path, kind, size),
                  [&](const char* in, char* out) {
                      return MAVOEAPathNoADFS(form, in, kind.c_str(), out, size);
                  });
    ExpectInPlace(path, lead, size, ModelADPath(path, size),
                  [&](const char* in, char* out) { return MAVOEAADPath(in, out, size); });
    ExpectInPlace(path, lead, size, ModelPath(form, path, kind, place, size),
                  [&](const char* in, char* out) {
                      return MAVOEAPath(form, in, kind.c_str(), out, size, place);
                  });
}

// Promise: "Paths: szBuf may be szPath"
TEST_F(EaPathPropertyTest, PathMayBeReplacedByTheDerivedOne) {
    Generator generate;
    for (int round = 0; round < 3000 / kSeriesStep && !HasFatalFailure(); ++round) {
        SCOPED_TRACE(round);
        ExpectAllInPlace(generate, 0);
    }
}

// Promise: "Paths: szBuf may be szPath"
TEST_F(EaPathPropertyTest, PathMayLieAnywhereInTheBuffer) {
    Generator generate;
    for (int round = 0; round < 1000 && !HasFatalFailure(); ++round) {
        SCOPED_TRACE(round);
        ExpectAllInPlace(generate, static_cast<std::size_t>(1 + generate.Below(300)));
    }
}

// Promise: "Paths: Pure string operations"
TEST_F(EaPathPropertyTest, PathAndKindOfTheCallerAreNeverModified) {
    const std::string before = "/v/" + As(300) + ".txt/";
    std::string path = before;
    std::string kind = "kind";
    std::vector<char> buffer(kRoom + 1);
    EXPECT_EQ(0, MAVOEADirPath(0, path.c_str(), buffer.data(), kRoom));
    EXPECT_EQ(0, MAVOEAPathNoADFS(1, path.c_str(), kind.c_str(), buffer.data(), kRoom));
    EXPECT_EQ(0, MAVOEAADPath(path.c_str(), buffer.data(), kRoom));
    EXPECT_EQ(0, MAVOEAPath(1, path.c_str(), kind.c_str(), buffer.data(), kRoom, 0));
    EXPECT_EQ(before, path);
    EXPECT_EQ("kind", kind);
}

// Promise: "mavoea.h: Threads."
// Promise: "THREADS: Path derivation"
TEST_F(EaPathPropertyTest, SeveralThreadsDeriveAtOnce) {
    const std::string path = "/v/" + As(241) + "bc.txt";
    const std::string expected = "/v/@eaDir/" + As(237) + "&.txt@MavoEAStream";
    std::vector<int> wrong(4, 0);
    std::vector<std::thread> threads;
    for (int& count : wrong) {
        threads.emplace_back([&] {
            std::vector<char> buffer(kRoom + 1);
            for (int i = 0; i < 2000; ++i) {
                const int result = MAVOEAPath(1, path.c_str(), MAVOEA_KIND_STREAM, buffer.data(),
                                              kRoom, EA_PLACE_EADIR);
                if (result != 0 || expected != buffer.data()) ++count;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_THAT(wrong, ElementsAre(0, 0, 0, 0));
}

}  // namespace
}  // namespace mavoea::test

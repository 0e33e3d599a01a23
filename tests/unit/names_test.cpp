// The names that file services hide or refuse, and the two marks set after a file has changed.

#include <errno.h>
#include <fcntl.h>
#include <libgen.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;

bool base_name_fails = false;
int base_names_taken = 0;

struct FreeList {
    void operator()(MLIBCSzList* list) const { MLIBCSzListFree(list); }
};

class NamesTest : public ::testing::Test {
 protected:
    void SetUp() override {
        ResetPlatform();
        ResetKernel();
        live_ = TakeAllocations().live;
        base_name_fails = false;
        base_names_taken = 0;
    }
    void TearDown() override {
        base_name_fails = false;
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_THAT(TakePlatformCalls(), IsEmpty());
        EXPECT_THAT(TakeCallNames(), IsEmpty());
        EXPECT_EQ(live_, TakeAllocations().live);
    }

 private:
    int live_ = 0;
};

class HiddenDirTest : public NamesTest {};
class HiddenDirGetTest : public NamesTest {};
class IndexTest : public NamesTest {};
class SmbArchiveTest : public NamesTest {};

// ---- The classes --------------------------------------------------------------------------------

// Promise: "Names and marks: The tests return"
// Promise: "MAVOEAIsHiddenDir: 1 for"
// Promise: "MAVOEAIsVetoFile"
// Promise: "MAVOEAIsHiddenFile"
TEST_F(NamesTest, EveryNameIsInItsClassAndTheWiderOnes) {
    enum Class { kNone, kHiddenFile, kVetoFile, kHiddenDir };
    const struct {
        std::string name;
        Class narrowest;
    } kNames[] = {
        {"@eaDir", kHiddenDir},
        {"@tmp", kHiddenDir},
        {"@sharebin", kHiddenDir},
        {"@EADIR", kHiddenDir},
        {"@eadir", kHiddenDir},
        {"@TmP", kHiddenDir},
        {"@sHaReBiN", kHiddenDir},
        {"/volume/share/@eaDir", kHiddenDir},
        {"/@TMP/", kHiddenDir},
        {".", kVetoFile},
        {"..", kVetoFile},
        {".MAVOGALDB", kVetoFile},
        {".MAVOGALDBx", kVetoFile},
        {".MAVOGALDB-journal", kVetoFile},
        {".DS_Store", kHiddenFile},
        {"._", kHiddenFile},
        {"._x", kHiddenFile},
        {"._.", kHiddenFile},
        {"._.DS_Store", kHiddenFile},
        {"", kNone},
        {"@", kNone},
        {"@eaDir2", kNone},
        {"@eaDi", kNone},
        {"@tmp ", kNone},
        {"@tmp/", kNone},
        {"@sharebins", kNone},
        {"eaDir", kNone},
        {"tmp", kNone},
        {"x@eaDir", kNone},
        {".@eaDir", kNone},
        {"share/@eaDir", kNone},
        {"...", kNone},
        {".x", kNone},
        {"./", kNone},
        {"../", kNone},
        {".mavogaldb", kNone},
        {".MAVOGALDb", kNone},
        {".MAVOGALD", kNone},
        {"MAVOGALDB", kNone},
        {"x.MAVOGALDB", kNone},
        {".DS_Store2", kNone},
        {".DS_Stor", kNone},
        {".ds_store", kNone},
        {"DS_Store", kNone},
        {"_x", kNone},
        {"x._", kNone},
        {"Icon\r", kNone},
        {"a.txt", kNone},
        {"MAVO:Resource", kNone},
        {":", kNone},
        {"\xFF\xFE", kNone},
    };
    for (const auto& [name, narrowest] : kNames) {
        SCOPED_TRACE(name);
        EXPECT_EQ(narrowest >= kHiddenDir ? 1 : 0, MAVOEAIsHiddenDir(name.c_str()));
        EXPECT_EQ(narrowest >= kVetoFile ? 1 : 0, MAVOEAIsVetoFile(name.c_str()));
        EXPECT_EQ(narrowest >= kHiddenFile ? 1 : 0, MAVOEAIsHiddenFile(name.c_str()));
        const bool bare = name.empty() || name[0] != '/';
        EXPECT_EQ(bare && narrowest >= kHiddenDir ? 1 : 0, MAVOEAIsHiddenDirName(name.c_str()));
    }
}

TEST_F(NamesTest, DotNamesAreNotFoundBehindAnAbsolutePath) {
    for (const char* const path :
         {"/v/.", "/v/..", "/v/.MAVOGALDB", "/v/.DS_Store", "/v/._x", "/.", "/._"}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(0, MAVOEAIsHiddenDir(path));
        EXPECT_EQ(0, MAVOEAIsVetoFile(path));
        EXPECT_EQ(0, MAVOEAIsHiddenFile(path));
    }
}

TEST_F(NamesTest, HiddenDirectoriesAreFoundBehindAnAbsolutePathByTheFileTestsToo) {
    for (const char* const path : {"/v/@eaDir", "/v/@tmp/", "/@SHAREBIN"}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(1, MAVOEAIsVetoFile(path));
        EXPECT_EQ(1, MAVOEAIsHiddenFile(path));
    }
}

// Promise: "Names and marks: The tests return"
// Promise: "MAVOEAIsHiddenDir: -1 on NULL"
// Promise: "MAVOEAIsHiddenDirName: -1 on NULL"
TEST_F(NamesTest, NoNameIsInNoClass) {
    EXPECT_EQ(0, MAVOEAIsVetoFile(nullptr));
    EXPECT_EQ(0, MAVOEAIsHiddenFile(nullptr));
    EXPECT_EQ(0, MAVOEAIsHiddenName(nullptr));
    EXPECT_EQ(-1, MAVOEAIsHiddenDir(nullptr));
    EXPECT_EQ(-1, MAVOEAIsHiddenDirName(nullptr));
}

// Promise: "mavoea.h: Threads."
// Promise: "THREADS: Path derivation"
TEST_F(NamesTest, SeveralThreadsTestAtOnce) {
    std::vector<int> wrong(4, 0);
    std::vector<std::thread> threads;
    for (int& count : wrong) {
        threads.emplace_back([&] {
            for (int i = 0; i < 2000; ++i) {
                const int right = MAVOEAIsHiddenDir("@eaDir") + MAVOEAIsHiddenDirName("@tmp") +
                                  MAVOEAIsVetoFile("..") + MAVOEAIsHiddenFile("._x") +
                                  MAVOEAIsHiddenName("a:b");
                if (right != 5) ++count;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_THAT(wrong, ElementsAre(0, 0, 0, 0));
}

// Promise: "MAVOEAIsHiddenName"
TEST_F(NamesTest, HiddenNameIsOneWithAColonAnywhere) {
    for (const char* const name : {":", "MAVO:Resource", ":x", "x:", "::", "/v/a:b", "/v:/a"}) {
        SCOPED_TRACE(name);
        EXPECT_EQ(1, MAVOEAIsHiddenName(name));
    }
    for (const char* const name : {"", "x", ";", "@eaDir", "._x", ".DS_Store", "Icon\r", "\xBA"}) {
        SCOPED_TRACE(name);
        EXPECT_EQ(0, MAVOEAIsHiddenName(name));
    }
    const std::string long_name(5000, 'x');
    EXPECT_EQ(0, MAVOEAIsHiddenName(long_name.c_str()));
    EXPECT_EQ(1, MAVOEAIsHiddenName((long_name + ":").c_str()));
}

TEST_F(NamesTest, BareNamesAllocateNothing) {
    const FailCall fault("malloc", ENOMEM, 0);
    EXPECT_EQ(1, MAVOEAIsHiddenDir("@eaDir"));
    EXPECT_EQ(0, MAVOEAIsHiddenDir("a"));
    EXPECT_EQ(1, MAVOEAIsHiddenDirName("@eaDir"));
    EXPECT_EQ(1, MAVOEAIsVetoFile(".."));
    EXPECT_EQ(1, MAVOEAIsHiddenFile("._x"));
    EXPECT_EQ(1, MAVOEAIsHiddenName(":"));
    EXPECT_FALSE(fault.fired());
    EXPECT_EQ(0U, TakeAllocations().total);
    EXPECT_EQ(0, base_names_taken);
}

// ---- Hidden directories -------------------------------------------------------------------------

// Promise: "MAVOEAIsHiddenDir: a path that begins"
TEST_F(HiddenDirTest, AbsolutePathIsReducedToItsLastComponent) {
    for (const char* const path :
         {"/volume/share/@sharebin/", "/volume/share/@sharebin", "/@tmp", "/@tmp/", "/@tmp///",
          "//@EADIR//", "/a/b/@eaDir/@tmp", "/x/./@eaDir"}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(1, MAVOEAIsHiddenDir(path));
    }
    for (const char* const path :
         {"/", "//", "/volume/@eaDir/a", "/@eaDir2", "/@eaDir/.", "/v/eaDir", "/a/"}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(0, MAVOEAIsHiddenDir(path));
    }
}

TEST_F(HiddenDirTest, PathsOfAnyLengthAreReduced) {
    const std::string parent = "/" + std::string(9000, 'x') + "/";
    EXPECT_EQ(1, MAVOEAIsHiddenDir((parent + "@tmp").c_str()));
    EXPECT_EQ(1, MAVOEAIsHiddenDir((parent + "@tmp/").c_str()));
    EXPECT_EQ(0, MAVOEAIsHiddenDir((parent + "@tmq").c_str()));
    EXPECT_EQ(0, MAVOEAIsHiddenDir(parent.c_str()));
}

TEST_F(HiddenDirTest, RelativePathIsComparedWhole) {
    EXPECT_EQ(0, MAVOEAIsHiddenDir("share/@eaDir"));
    EXPECT_EQ(0, MAVOEAIsHiddenDir("./@eaDir"));
    EXPECT_EQ(0, MAVOEAIsHiddenDir("@eaDir/"));
    EXPECT_EQ(0, MAVOEAIsHiddenDir("@eaDir/@eaDir"));
}

TEST_F(HiddenDirTest, PathOfTheCallerIsNotModified) {
    const std::string before = "/volume/share/@sharebin//";
    std::string path = before;
    EXPECT_EQ(1, MAVOEAIsHiddenDir(path.c_str()));
    EXPECT_EQ(before, path);
}

// Promise: "MAVOEAIsHiddenDirName: MAVOEAIsHiddenDir()"
TEST_F(HiddenDirTest, NameTestDecidesByTheFirstByte) {
    EXPECT_EQ(0, MAVOEAIsHiddenDirName("/v/@eaDir"));
    EXPECT_EQ(0, MAVOEAIsHiddenDirName("/@tmp"));
    EXPECT_EQ(0, MAVOEAIsHiddenDirName(""));
    EXPECT_EQ(0, MAVOEAIsHiddenDirName("eaDir"));
    EXPECT_EQ(0, MAVOEAIsHiddenDirName("."));
    EXPECT_EQ(0, MAVOEAIsHiddenDirName(".@tmp"));
    EXPECT_EQ(0, MAVOEAIsHiddenDirName("@"));
    EXPECT_EQ(1, MAVOEAIsHiddenDirName("@SHAREbin"));
    EXPECT_EQ(0, base_names_taken);
    EXPECT_EQ(0U, TakeAllocations().total);
}

// Promise: "MAVOEAIsHiddenDir: -1 on NULL"
TEST_F(HiddenDirTest, CopyThatCannotBeMadeIsRecorded) {
    const FailCall fault("malloc", ENOMEM, 0);
    for (const char* const path : {"/v/@eaDir", "/v/a", "/"}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(-1, MAVOEAIsHiddenDir(path));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x200, "ea_is_hidden_dir")));
    }
    EXPECT_TRUE(fault.fired());
}

// Promise: "MAVOEAIsHiddenDir: -1 on NULL"
TEST_F(HiddenDirTest, BaseNameThatCannotBeTakenIsRecordedAndTheCopyFreed) {
    base_name_fails = true;
    const int live = TakeAllocations().live;
    EXPECT_EQ(-1, MAVOEAIsHiddenDir("/v/@eaDir"));
    EXPECT_EQ(1, base_names_taken);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x9A00, "ea_is_hidden_dir")));
    EXPECT_EQ(live, TakeAllocations().live);
}

TEST_F(HiddenDirTest, FailureIsNoHiddenDirectoryToTheFileTests) {
    {
        const FailCall fault("malloc", ENOMEM, 0);
        EXPECT_EQ(0, MAVOEAIsVetoFile("/v/@eaDir"));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x200, "ea_is_hidden_dir")));
        EXPECT_EQ(0, MAVOEAIsHiddenFile("/v/@eaDir"));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x200, "ea_is_hidden_dir")));
    }
    base_name_fails = true;
    EXPECT_EQ(0, MAVOEAIsVetoFile("/v/@eaDir"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x9A00, "ea_is_hidden_dir")));
    EXPECT_EQ(0, MAVOEAIsHiddenFile("/v/@eaDir"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x9A00, "ea_is_hidden_dir")));
}

// ---- The list of hidden directories -------------------------------------------------------------

// Promise: "MAVOEAHiddenDirGet: Appends"
TEST_F(HiddenDirGetTest, AppendsTheThreeNamesInOrder) {
    MLIBCSzList* list = NewList();
    EXPECT_EQ(0, MAVOEAHiddenDirGet(&list));
    EXPECT_THAT(Strings(list), ElementsAre("@eaDir", "@tmp", "@sharebin"));
    MLIBCSzListFree(list);
}

// Promise: "MAVOEAHiddenDirGet: Appends"
TEST_F(HiddenDirGetTest, NamesInTheListStay) {
    MLIBCSzList* list = NewList({"before"});
    EXPECT_EQ(0, MAVOEAHiddenDirGet(&list));
    EXPECT_EQ(0, MAVOEAHiddenDirGet(&list));
    EXPECT_THAT(Strings(list), ElementsAre("before", "@eaDir", "@tmp", "@sharebin", "@eaDir",
                                           "@tmp", "@sharebin"));
    MLIBCSzListFree(list);
}

// Promise: "MAVOEAHiddenDirGet: 0, or -1"
TEST_F(HiddenDirGetTest, MissingListIsRefused) {
    EXPECT_EQ(-1, MAVOEAHiddenDirGet(nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_is_hidden_dir")));
    MLIBCSzList* list = nullptr;
    EXPECT_EQ(-1, MAVOEAHiddenDirGet(&list));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_is_hidden_dir")));
    EXPECT_EQ(nullptr, list);
}

// Promise: "MAVOEAHiddenDirGet: 0, or -1"
TEST_F(HiddenDirGetTest, NamesAppendedBeforeAFailureStay) {
    const std::vector<std::string> names = {"before", "@eaDir", "@tmp", "@sharebin"};
    for (int pushes = 0; pushes < 3; ++pushes) {
        SCOPED_TRACE(pushes);
        MLIBCSzList* list = NewList({"before"});
        Platform().pushes_until_failure = pushes;
        EXPECT_EQ(-1, MAVOEAHiddenDirGet(&list));
        EXPECT_EQ(std::vector<std::string>(names.begin(), names.begin() + 1 + pushes),
                  Strings(list));
        EXPECT_THAT(TakeRecords(), IsEmpty());
        MLIBCSzListFree(list);
    }
}

TEST_F(HiddenDirGetTest, EveryNameOfTheListIsAHiddenDirectory) {
    MLIBCSzList* list = NewList();
    ASSERT_EQ(0, MAVOEAHiddenDirGet(&list));
    const std::unique_ptr<MLIBCSzList, FreeList> owner(list);
    for (const std::string& name : Strings(list)) {
        EXPECT_EQ(1, MAVOEAIsHiddenDir(name.c_str()));
        EXPECT_EQ(1, MAVOEAIsHiddenDirName(name.c_str()));
    }
}

// ---- The search index ---------------------------------------------------------------------------

// Promise: "MAVOIndex: Tells"
TEST_F(IndexTest, ChangesAreForwardedToTheSearchIndex) {
    EXPECT_EQ(0, MAVOIndex("/v/a", nullptr, 7));
    EXPECT_EQ(0, MAVOIndex("/v/new", "/v/old", 4));
    EXPECT_EQ(0, MAVOIndex(nullptr, nullptr, -1));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MLIBMavoIndexAddEx(/v/a, NULL, 7, 0, 0)",
                                                 "MLIBMavoIndexAddEx(/v/new, /v/old, 4, 0, 0)",
                                                 "MLIBMavoIndexAddEx(NULL, NULL, -1, 0, 0)"));
}

// Promise: "MAVOIndex: returns"
TEST_F(IndexTest, AnswerOfTheSearchIndexIsReturnedAsItIs) {
    for (const int answer : {0, 1, -1, 42, -2000000000}) {
        Platform().index = [=](const std::string&) { return answer; };
        EXPECT_EQ(answer, MAVOIndex("/v/a", nullptr, 7));
    }
    EXPECT_EQ(5U, TakePlatformCalls().size());
}

// ---- The SMB archive bit ------------------------------------------------------------------------

constexpr char kAttribute[] = "user.mavo.attributes";

Bytes AttributeOf(const std::string& path) {
    Bytes value(64);
    const ssize_t size = getxattr(path.c_str(), kAttribute, value.data(), value.size());
    value.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
    return value;
}

void SetAttribute(const std::string& path, const Bytes& value) {
    ASSERT_EQ(0, setxattr(path.c_str(), kAttribute, value.data(), value.size(), 0))
        << strerror(errno);
}

bool KeepsUserAttributes(const std::string& directory) {
    return setxattr(directory.c_str(), "user.test", "", 0, 0) == 0;
}

// Promise: "EASetSmbArchive: Sets"
TEST_F(SmbArchiveTest, OpensReadOnlySetsTheBitAndCloses) {
    const TempDir temp;
    const std::string path = temp / "a";
    WriteFile(path, Ascii("data"));
    int fd_seen = -1;
    Hooks().archive = [&](int fd) {
        fd_seen = fd;
        struct stat of_descriptor;
        struct stat of_path;
        EXPECT_EQ(0, fstat(fd, &of_descriptor));
        EXPECT_EQ(0, stat(path.c_str(), &of_path));
        EXPECT_EQ(of_path.st_ino, of_descriptor.st_ino);
        EXPECT_EQ(of_path.st_dev, of_descriptor.st_dev);
        EXPECT_EQ(O_RDONLY, fcntl(fd, F_GETFL) & O_ACCMODE);
        return 0;
    };
    EXPECT_EQ(0, EASetSmbArchive(path.c_str()));
    EXPECT_EQ(-1, fcntl(fd_seen, F_GETFD));

    const std::vector<std::string> calls = TakeCalls();
    ASSERT_THAT(calls,
                ElementsAre(StartsWith("open(" + path + ", O_RDONLY"), "archive()", "close()"));
    for (const char* const flag : {"O_CREAT", "O_TRUNC"}) {
        EXPECT_EQ(std::string::npos, calls[0].find(flag));
    }
    EXPECT_EQ(Ascii("data"), ReadFile(path));
}

TEST_F(SmbArchiveTest, ResultOfTheKernelIsReturnedAsItIs) {
    const TempDir temp;
    WriteFile(temp / "a", {});
    for (const int result : {0, 1, 5, -1, -7}) {
        Hooks().archive = [=](int) { return result; };
        EXPECT_EQ(result, EASetSmbArchive((temp / "a").c_str()));
        EXPECT_THAT(TakeCallNames(), ElementsAre("open", "archive", "close"));
    }
}

// Promise: "EASetSmbArchive: 0, or -1"
TEST_F(SmbArchiveTest, FailureOfTheKernelLeavesItsErrnoAndNoRecord) {
    const TempDir temp;
    WriteFile(temp / "a", {});
    const FailCall fault("archive", ENOTTY);
    errno = 0;
    EXPECT_EQ(-1, EASetSmbArchive((temp / "a").c_str()));
    EXPECT_EQ(ENOTTY, errno);
    EXPECT_THAT(TakeCallNames(), ElementsAre("open", "archive", "close"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "EASetSmbArchive: 0, or -1"
TEST_F(SmbArchiveTest, FileThatCannotBeOpenedIsAFailureWithoutARecord) {
    const TempDir temp;
    errno = 0;
    EXPECT_EQ(-1, EASetSmbArchive((temp / "missing").c_str()));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_THAT(TakeCallNames(), ElementsAre("open"));
    EXPECT_FALSE(Exists(temp / "missing"));

    WriteFile(temp / "a", {});
    const FailCall fault("open", EMFILE);
    EXPECT_EQ(-1, EASetSmbArchive((temp / "a").c_str()));
    EXPECT_EQ(EMFILE, errno);
    EXPECT_THAT(TakeCallNames(), ElementsAre("open"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(SmbArchiveTest, MissingPathIsAFailureWithoutARecord) {
    EXPECT_EQ(-1, EASetSmbArchive(nullptr));
    TakeCallNames();
}

TEST_F(SmbArchiveTest, FifoWithoutAWriterDoesNotHoldTheCallerUp) {
    const TempDir temp;
    ASSERT_EQ(0, mkfifo((temp / "fifo").c_str(), 0600));
    Hooks().archive = [](int) { return 0; };
    EXPECT_EQ(0, EASetSmbArchive((temp / "fifo").c_str()));
    TakeCallNames();
}

// On a real file, where the host keeps the bit in an extended attribute.
class SmbArchiveOnHostTest : public SmbArchiveTest {
 protected:
    void SetUp() override {
        SmbArchiveTest::SetUp();
        if (!KeepsUserAttributes(temp_.path())) {
            GTEST_SKIP() << "no user extended attributes in " << temp_.path();
        }
        WriteFile(file_, Ascii("data"));
    }
    void TearDown() override {
        TakeCallNames();  // Looked at above; here the file counts.
        SmbArchiveTest::TearDown();
    }

    const TempDir temp_;
    const std::string file_ = temp_ / "a";
};

// Promise: "EASetSmbArchive: Sets"
// Promise: "Attribute word: A host whose"
TEST_F(SmbArchiveOnHostTest, BitIsKeptBigEndianInFourBytes) {
    ASSERT_THAT(AttributeOf(file_), IsEmpty());
    EXPECT_EQ(0, EASetSmbArchive(file_.c_str()));
    EXPECT_EQ(Hex("00 00 00 01"), AttributeOf(file_));
    EXPECT_EQ(0, EASetSmbArchive(file_.c_str()));
    EXPECT_EQ(Hex("00 00 00 01"), AttributeOf(file_));
    EXPECT_EQ(Ascii("data"), ReadFile(file_));
}

TEST_F(SmbArchiveOnHostTest, OtherBitsStay) {
    SetAttribute(file_, Hex("00 00 00 24"));
    EXPECT_EQ(0, EASetSmbArchive(file_.c_str()));
    EXPECT_EQ(Hex("00 00 00 25"), AttributeOf(file_));

    SetAttribute(file_, Hex("80 01 FE 00"));
    EXPECT_EQ(0, EASetSmbArchive(file_.c_str()));
    EXPECT_EQ(Hex("80 01 FE 01"), AttributeOf(file_));
}

TEST_F(SmbArchiveOnHostTest, ValueOfAnotherSizeCountsAsNoBits) {
    for (const Bytes& value : {Hex("FF FF FF"), Hex("FF FF FF FF FF"), Bytes{}}) {
        SetAttribute(file_, value);
        EXPECT_EQ(0, EASetSmbArchive(file_.c_str()));
        EXPECT_EQ(Hex("00 00 00 01"), AttributeOf(file_));
    }
}

TEST_F(SmbArchiveOnHostTest, DirectoriesAreMarkedLikeFiles) {
    EXPECT_EQ(0, EASetSmbArchive(temp_.path().c_str()));
    EXPECT_EQ(Hex("00 00 00 01"), AttributeOf(temp_.path()));
}

}  // namespace
}  // namespace mavoea::test

// Stands in for the C library's basename() of <libgen.h>, which cannot be made to fail. As POSIX
// has it for absolute paths, the only ones that reach it: trailing slashes are cut off in place,
// and nothing but slashes is "/".
extern "C" char* __xpg_basename(char* path) noexcept {
    using namespace mavoea::test;
    ++base_names_taken;
    if (base_name_fails) return nullptr;
    size_t length = strlen(path);
    while (length > 1 && path[length - 1] == '/') path[--length] = '\0';
    if (length == 1) return path;
    return strrchr(path, '/') + 1;
}

// What the pages of the manual say in RETURN VALUE, ERRORS and CODES, of calls that need no fault
// to fail.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <ostream>
#include <string>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tests/support/process.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

// What a call has left: 0 for an errno that it leaves alone, and for no code.
struct Outcome {
    long result;
    int error;
    int code;

    bool operator==(const Outcome&) const = default;
};

std::ostream& operator<<(std::ostream& out, const Outcome& outcome) {
    return out << outcome.result << ", errno " << strerror(outcome.error) << ", code 0x" << std::hex
               << outcome.code << std::dec;
}

template <class Call>
Outcome Of(Call call) {
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    const auto result = static_cast<long>(call());
    return {result, errno, MLIBCErrGet()};
}

#define OF(call) Of([&] { return (call); })

constexpr Outcome Failed(int error, int code) { return {-1, error, code}; }

class ResultsTest : public ::testing::Test {
 protected:
    void SetUp() override { WriteFile(object_, {}); }

    TempDir dir_;
    std::string object_ = dir_ / "object";
    std::string nowhere_ = dir_ / "none/object";
    char buffer_[MAVOEA_PATH_SIZE + 1] = {};
};

TEST_F(ResultsTest, OfPaths) {
    EXPECT_EQ(Failed(ENOENT, 0xD00), OF(MAVOEADirPath(1, nullptr, buffer_, 4096)));
    EXPECT_EQ(Failed(ENOENT, 0xD00), OF(MAVOEADirPath(1, "", buffer_, 4096)));
    EXPECT_EQ(Failed(ENAMETOOLONG, 0xC300), OF(MAVOEADirPath(1, "/v/a", buffer_, 10)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEADirPath(1, "/v/a", buffer_, 11)));
    EXPECT_EQ(Failed(ENOENT, 0xD00), OF(MAVOEAPathNoADFS(1, "/v/a", "k", nullptr, 4096)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAPathNoADFS(1, "/v/a", nullptr, buffer_, 4096)));
    EXPECT_EQ(Failed(ENAMETOOLONG, 0xC300), OF(MAVOEAPathNoADFS(1, "/v/a", "k", buffer_, 13)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEAPathNoADFS(1, "/v/a", "k", buffer_, 14)));
    EXPECT_STREQ("/v/@eaDir/a@k", buffer_);
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAPath(1, "/v/a", "k", buffer_, 4096, 2)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAADPath("/v/a", nullptr, 4096)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAADPath("/v/abc", buffer_, 0)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEAADPath("/v/abc", buffer_, 5)));
    EXPECT_STREQ("/v/.", buffer_);
    const std::string long_name(254, 'n');
    EXPECT_EQ(Failed(0, 0xC300), OF(MAVOEAADPath(long_name.c_str(), buffer_, 4096)));
}

TEST_F(ResultsTest, OfOpening) {
    const char* const object = object_.c_str();
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAMKDir(0, nullptr)));
    EXPECT_EQ(Failed(ENOENT, 0xD00), OF(MAVOEAOpen(1, nullptr, "k", O_RDONLY, 0)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAOpen(1, object, "k", O_RDONLY, 2)));
    EXPECT_EQ(Failed(ENOENT, 0), OF(MAVOEAOpen(1, object, MAVOEA_KIND_STREAM, O_RDONLY, 0)));

    const std::string file = dir_ / "._object";
    ASSERT_EQ(0, symlink("elsewhere", file.c_str()));
    EXPECT_EQ(Failed(ELOOP, 0), OF(MAVOEAOpen(1, object, MAVOEA_KIND_STREAM, O_RDWR, 1)));
    ASSERT_EQ(0, unlink(file.c_str()));
    ASSERT_EQ(0, mkdir(file.c_str(), 0777));
    EXPECT_EQ(Failed(EISDIR, 0), OF(MAVOEAOpen(1, object, MAVOEA_KIND_STREAM, O_RDONLY, 1)));
    ASSERT_EQ(0, rmdir(file.c_str()));
    ASSERT_EQ(0, mkfifo(file.c_str(), 0666));
    EXPECT_EQ(Failed(ENXIO, 0), OF(MAVOEAOpen(1, object, MAVOEA_KIND_STREAM, O_RDWR, 1)));

    // What there is is opened with O_EXCL, too.
    ASSERT_EQ(0, unlink(file.c_str()));
    for (int i = 0; i < 2; ++i) {
        const int fd = MAVOEAOpen(1, object, MAVOEA_KIND_STREAM, O_RDWR | O_CREAT | O_EXCL, 1);
        EXPECT_LE(0, fd);
        close(fd);
    }
}

TEST_F(ResultsTest, OfOpeningWithoutTheRightsOfTheSuperuser) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    AsUser(12345, Root::kGivenUp, [&] {
        EXPECT_EQ(Failed(EPERM, 0x3C00), OF(MAVOEAMKDir(0, (dir_ / "@eaDir").c_str())));
        EXPECT_EQ(Failed(EPERM, 0x3C00), OF(MAVOEAOpen(1, object_.c_str(), MAVOEA_KIND_STREAM,
                                                       O_RDWR | O_CREAT, EA_PLACE_EADIR)));
    });
}

TEST_F(ResultsTest, OfNamesAndMarks) {
    EXPECT_EQ(Failed(0, 0), OF(MAVOEAIsHiddenDir(nullptr)));
    EXPECT_EQ(Failed(0, 0), OF(MAVOEAIsHiddenDirName(nullptr)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEAIsHiddenFile(nullptr)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAHiddenDirGet(nullptr)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOIndex("/a", nullptr, 7)));
    EXPECT_EQ(Failed(EFAULT, 0), OF(EASetSmbArchive(nullptr)));
    EXPECT_EQ(Failed(ENOENT, 0), OF(EASetSmbArchive(nowhere_.c_str())));
}

// Whether a stream is opened, which is closed again.
Outcome Open(int fd, int lock) {
    return Of([&] {
        EASHandle* const h = MAVOEASOpen(fd, lock);
        if (h != nullptr) MAVOEASClose(h);
        return h != nullptr ? 0 : -1;
    });
}

TEST_F(ResultsTest, OfHandles) {
    const int reads = open(object_.c_str(), O_RDONLY | O_CLOEXEC);
    const int writes = open(object_.c_str(), O_WRONLY | O_CLOEXEC);
    EXPECT_EQ(Failed(0, 0xD00), Open(-1, F_RDLCK));
    EXPECT_EQ(Failed(EINVAL, 0x400), Open(reads, 77));
    EXPECT_EQ(Failed(EBADF, 0x400), Open(reads, F_WRLCK));
    EXPECT_EQ(Failed(EBADF, 0x400), Open(writes, F_RDLCK));
    ASSERT_EQ(7, write(writes, "garbage", 7));
    EXPECT_EQ(Failed(0, 0xA00), Open(reads, F_RDLCK));
    int ends[2];
    ASSERT_EQ(0, pipe(ends));
    EXPECT_EQ(Failed(ESPIPE, 0xA00), Open(ends[0], F_UNLCK));
    for (const int fd : {reads, writes, ends[0], ends[1]}) close(fd);

    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASClose(nullptr)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASLockSet(nullptr, F_RDLCK)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASFlush(nullptr)));
}

TEST_F(ResultsTest, OfAttributesOfStreams) {
    const int fd = open(object_.c_str(), O_RDWR | O_CLOEXEC);
    EASHandle* const h = MAVOEASOpen(fd, F_WRLCK);
    ASSERT_NE(nullptr, h);
    char value[8] = {};
    EXPECT_EQ((Outcome{4, 0, 0}), OF(MAVOEASWrite(h, "a", "blue", 4, 0, 0)));
    EXPECT_EQ(Failed(EEXIST, 0), OF(MAVOEASWrite(h, "a", "red", 3, 0, 0)));
    EXPECT_EQ((Outcome{0, EEXIST, 0}), OF(MAVOEASWrite(h, "a", "", 0, 0, 0)));
    EXPECT_EQ(Failed(ENOENT, 0), OF(MAVOEASWrite(h, "b", "red", 3, 0, EAS_WRITE_MUST_EXIST)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASWrite(h, std::string(255, 'n').c_str(), "", 0, 0, 0)));
    EXPECT_EQ((Outcome{3, 0, 0}), OF(MAVOEASWrite(h, "a", "red", 3, 0, EAS_WRITE_OVERWRITE)));
    EXPECT_EQ((Outcome{4, 0, 0}), OF(MAVOEASRead(h, "a", value, sizeof value, 0)));
    EXPECT_STREQ("rede", value);
    EXPECT_EQ((Outcome{4, 0, 0}), OF(MAVOEASRead(h, "a", value, 0, 2)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEASRead(h, "a", value, 0, 9)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEASRead(h, "a", value, 1, 9)));
    EXPECT_EQ(Failed(0, 0x2000), OF(MAVOEASRead(h, "b", value, 1, 0)));
    EXPECT_EQ(Failed(0, 0x2000), OF(MAVOEASSearch(h, "b")));
    EXPECT_EQ(Failed(0, 0x2000), OF(MAVOEASRemove(h, "b")));
    EXPECT_EQ(Failed(0, 0x2000), OF(MAVOEASTruncate(h, "b", 0)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASTruncate(h, "a", 0x80000000U)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASEnum(h, nullptr)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASAllocEntry(h, -1)));
    auto* const bytes = reinterpret_cast<unsigned char*>(value);
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEASUpdateEntry(h, 1, bytes, sizeof value, 0)));
    EXPECT_EQ(Failed(0, 0x100), OF(MAVOEASUpdateEntry(h, 0, bytes, 1, 0)));
    EXPECT_EQ(Failed(EINVAL, 0x400), OF(MAVOEASLockSet(h, 77)));

    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEASLockSet(h, F_RDLCK)));
    EXPECT_EQ(Failed(0, 0x300), OF(MAVOEASWrite(h, "c", "", 0, 0, 0)));
    EXPECT_EQ(Failed(0, 0x300), OF(MAVOEASRemove(h, "a")));
    EXPECT_EQ(Failed(0, 0x300), OF(MAVOEASTruncate(h, "a", 0)));
    EXPECT_EQ(Failed(0, 0x300), OF(MAVOEASWriteHeader(h)));
    EXPECT_EQ(Failed(0, 0x300), OF(EASWriteFinderInfo(h)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEASLockSet(h, F_UNLCK)));
    EXPECT_EQ(Failed(0, 0x300), OF(MAVOEASRead(h, "a", value, 1, 0)));
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEASClose(h)));
    close(fd);
}

// Promise: "Named attributes: Where the filesystem"
TEST_F(ResultsTest, OfExtendedAttributes) {
    const std::string fork = "com.apple.ResourceFork";
    char value[8];
    MLIBCSzList* names = MLIBCSzListAlloc(1);
    ASSERT_EQ(0, MLIBCSzListPush(&names, "from before"));
    EXPECT_EQ(0, MAVOEAXattrEnum(nowhere_.c_str(), &names)) << "a missing object has none";
    EXPECT_EQ(nullptr, MLIBCSzListGet(names, 0));
    MLIBCSzListFree(names);

    const char* const object = object_.c_str();
    const char* const dir = dir_.path().c_str();
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAXattrGet(object, "user.a", nullptr, 1)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAXattrSet(object, "user.a", value, -1, 0)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAXattrSet(object, "user.a", nullptr, 0, 0)));
    EXPECT_EQ(Failed(ENOENT, 0), OF(MAVOEAXattrGet(nowhere_.c_str(), "user.a", value, 8)));
    EXPECT_EQ(Failed(ENOENT, 0x700), OF(MAVOEAXattrGet(nowhere_.c_str(), fork.c_str(), value, 8)));
    EXPECT_EQ(Failed(0, 0x700), OF(MAVOEAXattrGet(dir, fork.c_str(), value, 8)));
    EXPECT_EQ(Failed(0, 0x700), OF(MAVOEAXattrSet(dir, fork.c_str(), value, 8, 0)));
    EXPECT_EQ(Failed(0, 0x700), OF(MAVOEAXattrRemove(dir, fork.c_str())));
    EXPECT_EQ(Failed(ENOTDIR, 0), OF(MAVOEAXattrGet(object, fork.c_str(), value, 8)));
    EXPECT_EQ(Failed(ENOTDIR, 0), OF(MAVOEAXattrSet(object, fork.c_str(), value, 8, 0)));
    EXPECT_EQ(Failed(ENOTDIR, 0), OF(MAVOEAXattrRemove(object, fork.c_str())));
}

TEST_F(ResultsTest, OfRecords) {
    EAAdouble record = {};
    unsigned char block[741] = {0x00, 0x05, 0x16, 0x07, 0x00, 0x02};
    const char* const object = object_.c_str();
    EXPECT_EQ((Outcome{0, 0, 0}), OF(MAVOEAAdoubleRead(block, sizeof block, &record)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAAdoubleRead(block, 1025, &record)));
    EXPECT_EQ(1, MAVOEAEADirAdoubleRead(object, &record)) << "there is none";
    EXPECT_EQ(Failed(ENOENT, 0x900), OF(MAVOEAEADirAdoubleFlush(block, sizeof block, object)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAEADirAdoubleFlush(block, 1025, object)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAFileEAAdoubleFlush(block, -1, object)));
    EXPECT_EQ(Failed(ENOENT, 0xB00),
              OF(MAVOEAFileEAAdoubleFlush(block, sizeof block, nowhere_.c_str())));

    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block, sizeof block, object));
    EXPECT_EQ(0, MAVOEAEADirAdoubleRead(object, &record));
    block[25] = 1;  // an entry of id 0
    EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block, sizeof block, object));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAEADirAdoubleRead(object, &record)));
    block[0] = 1;
    EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block, sizeof block, object));
    EXPECT_EQ(Failed(0, 0xA00), OF(MAVOEAEADirAdoubleRead(object, &record)));
    EXPECT_EQ(0, MAVOEAEADirAdoubleFlush(block, 740, object));
    ASSERT_EQ(0, truncate((dir_ / "@eaDir/object@MavoResource").c_str(), 740));
    EXPECT_EQ((Outcome{1, 0, 0}), OF(MAVOEAEADirAdoubleRead(object, &record)));
}

TEST_F(ResultsTest, OfFinderInfo) {
    const unsigned char info[32] = {'T', 'E', 'X', 'T'};
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAEADirFSFInfoWrite(nullptr, info)));
    EXPECT_EQ(Failed(0, 0xD00), OF(EASWriteFinderInfo(nullptr)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAFileEAFSFinfoEASync(nullptr, 0)));
    EXPECT_EQ(0, MAVOEAFileEAFSFinfoEASync(nullptr, 1)) << "it is on no such volume";
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAFileEAWriteFlushTime(nullptr, 1)));
    EXPECT_EQ(Failed(ENOENT, 0x2A00), OF(MAVOEAFileEAWriteFlushTime(nowhere_.c_str(), 0)));

    if (!RunsAsRoot()) GTEST_SKIP() << "takes the superuser, to make an EA directory";
    EXPECT_EQ(0, MAVOEAEADirFSFInfoWrite(object_.c_str(), info));
    const std::string file = dir_ / "@eaDir/object@MavoResource";
    EXPECT_EQ(82U, ReadFile(file).size());
    const int fd = open(file.c_str(), O_RDWR | O_CLOEXEC);
    EASHandle* const h = MAVOEASOpen(fd, F_WRLCK);
    ASSERT_NE(nullptr, h);
    AsUser(0, Root::kSaved, [&] {
        EXPECT_EQ(Failed(EAGAIN, 0x400), OF(MAVOEAEADirFSFInfoWrite(object_.c_str(), info)));
    });
    // In this process it drops the handle's lock.
    EXPECT_EQ(0, MAVOEAEADirFSFInfoWrite(object_.c_str(), info));
    AsUser(0, Root::kSaved, [&] { EXPECT_EQ(0, MAVOEAEADirFSFInfoWrite(object_.c_str(), info)); });
    EXPECT_EQ(0, MAVOEASClose(h));
    close(fd);
}

TEST_F(ResultsTest, OfEarlierLayouts) {
    const char* const object = object_.c_str();
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEACheckADFile(nullptr)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEACheckADFile("")));
    EXPECT_EQ((Outcome{-2, 0, 0}), OF(MAVOEACheckADFile(object)));
    EXPECT_EQ((Outcome{-3, ENOENT, 0}), OF(MAVOEACheckADFile((dir_ / "._object").c_str())));
    EXPECT_EQ(Failed(ENOENT, 0), OF(MAVOEAFixErrorAD(object)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAUpgrade(object, nullptr)));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEAUpgrade(object, "other")));
    EXPECT_EQ(2, MAVOEAUpgrade(object, MAVOEA_KIND_STREAM));
}

// Promise: "MAVOEACopyEx: -1 or less"
TEST_F(ResultsTest, OfACopyThatTellsWhatItMet) {
    const std::string file = dir_ / "@eaDir/object@MavoResource";
    std::string to = dir_ / "copy";
    const auto copy = [&] { return MAVOEACopy(object_.c_str(), to.data(), 0, 0, 1, 0, 0, 0); };
    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    ASSERT_EQ(0, symlink("elsewhere", file.c_str()));
    EXPECT_EQ(-2, copy()) << "it cannot be opened";
    ASSERT_EQ(0, unlink(file.c_str()));

    Bytes head = {0x00, 0x05, 0x16, 0x07, 0x00, 0x01, 0x00, 0x00};  // AppleDouble, version 1
    head.resize(82);
    WriteFile(file, head);
    EXPECT_EQ(-1, copy());
    head[5] = 2;
    head[25] = 3;  // entries, the first of which is the Finder info
    head[29] = 9;
    WriteFile(file, head);
    EXPECT_EQ(-5, copy());
    head.resize(10);
    WriteFile(file, head);
    EXPECT_EQ(-5, copy());
    EXPECT_FALSE(Exists(dir_ / "._copy"));
}

TEST_F(ResultsTest, OfCarrying) {
    const char* const object = object_.c_str();
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEARemove(nullptr, 1, nullptr)));
    EXPECT_EQ(Failed(ENOENT, 0xD00), OF(EARemove(1, nullptr)));
    EXPECT_EQ(Failed(0, 0), OF(EARemoveEADir(object)));
    EXPECT_EQ(0, EARemoveEADir((dir_ / "@eaDir").c_str()));
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEARename(nullptr, object, 1, nullptr)));
    EXPECT_EQ(Failed(EINVAL, 0), OF(MAVOEARename(object, "relative", -1, nullptr)));
    EXPECT_EQ(0, MAVOEARename(object, nowhere_.c_str(), 0, nullptr)) << "whatever became of it";

    std::string to = nowhere_;
    EXPECT_EQ(Failed(0, 0xD00), OF(MAVOEACopy(nullptr, to.data(), 0, 0, 1, 1, 0, 0)));
    EXPECT_EQ((Outcome{-4, 0, 0}), OF(MAVOEACopy(object, to.data(), 0, 0, 4, 1, 0, 0)));
    EXPECT_EQ(0, MAVOEACopy(object, to.data(), 0, 0, 1, 4, 0, 0)) << "it takes no metadata";
    to = dir_ / std::string(254, 'n');
    EXPECT_EQ(-3, MAVOEACopy(object, to.data(), 0, 0, 1, 0, 0, 0));
}

}  // namespace
}  // namespace mavoea::test

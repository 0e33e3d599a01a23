// How many system calls the shared library's operations make.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <initializer_list>
#include <string>
#include <utility>

#include "include/mavoea.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"
#include "tests/syscalls/traced.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::PrintToString;

constexpr unsigned kValueSize = 32;

std::string NameOf(int index) { return "user.attribute." + std::to_string(1000 + index); }

StreamImage ImageOf(int count) {
    StreamImage image;
    for (int i = 0; i < count; ++i) {
        image.attributes.push_back({NameOf(i), Pattern(kValueSize, static_cast<std::uint8_t>(i))});
    }
    return image;
}

class SystemCallsTest : public ::testing::Test {
 protected:
    // Lists the calls of `code`, which must return true; skips the test where that is impossible.
    void Trace(const std::function<bool()>& code) {
        std::string why_not;
        const auto trace = TraceCalls(code, &why_not);
        if (!trace) GTEST_SKIP() << "system calls are not counted: " << why_not;
        ASSERT_TRUE(trace->succeeded) << "the traced code failed";
        calls_ = trace->calls;
    }

    long Count(std::initializer_list<const char*> names) const {
        return std::count_if(calls_.begin(), calls_.end(), [&](const std::string& call) {
            return std::find(names.begin(), names.end(), call) != names.end();
        });
    }
    long Reads() const { return Count({"read", "readv", "pread", "preadv"}); }
    long Writes() const { return Count({"write", "writev", "pwrite", "pwritev"}); }
    long Syncs() const { return Count({"fsync", "fdatasync", "sync"}); }

    // Opens, reads one of `count` values and closes, the descriptor included.
    void TraceReadingOneOf(int count) {
        const std::string object = dir_ / "object";
        const StreamImage image = ImageOf(count);
        (void)mkdir((dir_ / "@eaDir").c_str(), 0777);
        WriteFile(dir_ / "@eaDir/object@MavoEAStream", image.Build());
        const auto& wanted = image.attributes[static_cast<std::size_t>(count) / 2];
        Bytes value(kValueSize);
        Trace([&] {
            const int fd = MAVOEAOpen(EA_FORM_FILE, object.c_str(), MAVOEA_KIND_STREAM, O_RDONLY,
                                      EA_PLACE_EADIR);
            EASHandle* const h = MAVOEASOpen(fd, F_RDLCK);
            if (h == nullptr) return false;
            const int got = MAVOEASRead(h, wanted.name.c_str(), value.data(), kValueSize, 0);
            return MAVOEASClose(h) == 0 && close(fd) == 0 && got == kValueSize &&
                   value == wanted.value;
        });
    }

    // Opens a metadata file that is not there.
    void TraceMissing(const std::string& object, const char* kind) {
        Trace([&] {
            return MAVOEAOpen(EA_FORM_FILE, object.c_str(), kind, O_RDONLY, EA_PLACE_EADIR) == -1;
        });
    }

    // Overwrites the first value of a stream that is open, with as many bytes.
    void TraceOverwritingIn(const StreamImage& image) {
        const std::string path = dir_ / "stream";
        WriteFile(path, image.Build());
        const int fd = open(path.c_str(), O_RDWR);
        ASSERT_GE(fd, 0);
        const Bytes value = Pattern(kValueSize, 99);
        EASHandle* h = nullptr;
        int next = 0;
        Trace([&] {
            // In the child: locks are not inherited.
            if (h == nullptr) h = MAVOEASOpen(fd, F_WRLCK);
            return h != nullptr && MAVOEASWrite(h, NameOf(next++).c_str(), value.data(), kValueSize,
                                                0, EAS_WRITE_OVERWRITE) == kValueSize;
        });
        close(fd);
    }

    TempDir dir_;
    std::vector<std::string> calls_;
};

TEST_F(SystemCallsTest, PathDerivationMakesNone) {
    const std::string longest = "/v/share/" + std::string(300, 'n') + ".txt";
    Trace([&] {
        char to[MAVOEA_PATH_SIZE + 1];
        return MAVOEAPath(EA_FORM_FILE, "/v/share/a.txt", MAVOEA_KIND_STREAM, to, MAVOEA_PATH_SIZE,
                          EA_PLACE_EADIR) == 0 &&
               MAVOEAPath(EA_FORM_FILE, longest.c_str(), MAVOEA_KIND_STREAM, to, MAVOEA_PATH_SIZE,
                          EA_PLACE_EADIR) == 0 &&
               MAVOEAPathNoADFS(EA_FORM_FOLDER, "/v/share/a.txt", MAVOEA_KIND_LEGACY_RESOURCE, to,
                                MAVOEA_PATH_SIZE) == 0 &&
               MAVOEADirPath(EA_FORM_FILE, "/v/share/a.txt", to, MAVOEA_PATH_SIZE) == 0 &&
               MAVOEAADPath("/v/share/a.txt", to, MAVOEA_PATH_SIZE) == 0;
    });
    EXPECT_THAT(calls_, IsEmpty());
}

TEST_F(SystemCallsTest, NameTestsMakeNone) {
    Trace([] {
        return MAVOEAIsHiddenName("MAVO:Resource") == 1 && MAVOEAIsHiddenDir("/v/@tmp") == 1 &&
               MAVOEAIsHiddenDirName("@eaDir") == 1 && MAVOEAIsVetoFile("a.txt") == 0 &&
               MAVOEAIsHiddenFile("._a.txt") == 1;
    });
    EXPECT_THAT(calls_, IsEmpty());
}

// One open of the stream, and one look at each place that other layouts have: the "._" file, the EA
// directory.
TEST_F(SystemCallsTest, OpeningAMissingStreamOfAnObjectWithoutLegacyMetadataTakesThree) {
    const std::string object = dir_ / "a.txt";
    WriteFile(object, Ascii("data"));
    TraceMissing(object, MAVOEA_KIND_STREAM);
    if (IsSkipped() || HasFatalFailure()) return;
    EXPECT_EQ(3u, calls_.size()) << PrintToString(calls_);
    EXPECT_EQ(1, Count({"open"})) << PrintToString(calls_);
    EXPECT_EQ(0, Reads()) << PrintToString(calls_);
    EXPECT_EQ(0, Count({"chdir", "fchdir", "rmdir", "mkdir", "mkdirat"})) << PrintToString(calls_);
}

// Where there is an EA directory, for others, another process may be converting what is looked for
// from one place to the other: the file is looked for once more, behind both.
TEST_F(SystemCallsTest, OpeningAMissingFileBesideOthersMetadataTakesOneMoreOpenAndNoSecondLook) {
    const std::string object = dir_ / "a.txt";
    WriteFile(object, Ascii("data"));
    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    for (const auto& [kind, calls] :
         {std::pair{MAVOEA_KIND_STREAM, 5u}, {MAVOEA_KIND_RESOURCE, 3u}}) {
        SCOPED_TRACE(kind);
        TraceMissing(object, kind);
        if (IsSkipped() || HasFatalFailure()) return;
        EXPECT_EQ(calls, calls_.size()) << PrintToString(calls_);
        EXPECT_EQ(0, Reads()) << PrintToString(calls_);
    }
}

// Who is the superuser asks that once, and for no directory where there is the file.
TEST_F(SystemCallsTest, OpeningAStreamToWriteTakesNoLookAtItsDirectory) {
    if (geteuid() != 0) GTEST_SKIP() << "this is about the superuser";
    const std::string object = dir_ / "a.txt";
    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    WriteFile(dir_ / "@eaDir/a.txt@MavoEAStream", {});
    Trace([&] {
        return MAVOEAOpen(EA_FORM_FILE, object.c_str(), MAVOEA_KIND_STREAM, O_RDWR | O_CREAT,
                          EA_PLACE_EADIR) >= 0;
    });
    if (IsSkipped() || HasFatalFailure()) return;
    EXPECT_THAT(calls_, ElementsAre("geteuid", "open", "statx"));
}

// A file that is made with O_EXCL needs no look, one for reading and writing no change of its
// flags.
TEST_F(SystemCallsTest, MakingTheFileOfARecordTakesTwoOpensAndAWrite) {
    const std::string object = dir_ / "a.txt";
    WriteFile(object, Ascii("data"));
    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    const Bytes block = Pattern(741);
    Trace([&] { return MAVOEAEADirAdoubleFlush(block.data(), 741, object.c_str()) == 0; });
    if (IsSkipped() || HasFatalFailure()) return;
    EXPECT_EQ(3u, calls_.size()) << PrintToString(calls_);
    EXPECT_EQ(1, Writes()) << PrintToString(calls_);
}

TEST_F(SystemCallsTest, OpeningAStreamTakesOneLookAndForReadingOneChangeOfItsFlags) {
    const std::string object = dir_ / "a.txt";
    WriteFile(object, Ascii("data"));
    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    WriteFile(dir_ / "@eaDir/a.txt@MavoEAStream", {});
    for (const auto& [flags, calls] : {std::pair{O_RDWR, 2u}, {O_RDONLY, 3u}}) {
        SCOPED_TRACE(flags);
        Trace([&, flags = flags] {
            return MAVOEAOpen(EA_FORM_FILE, object.c_str(), MAVOEA_KIND_STREAM, flags,
                              EA_PLACE_EADIR) >= 0;
        });
        if (IsSkipped() || HasFatalFailure()) return;
        EXPECT_EQ(calls, calls_.size()) << PrintToString(calls_);
    }
}

// One look at each file and a rename, one for the legacy folder, and the archive mark by its path,
// which may be in two attributes.
TEST_F(SystemCallsTest, RenamingAnObjectsMetadataTakesSeven) {
    const std::string one = dir_ / "a.txt";
    const std::string other = dir_ / "b.txt";
    WriteFile(one, {});
    WriteFile(other, {});
    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    for (const char* kind : {MAVOEA_KIND_STREAM, MAVOEA_KIND_RESOURCE}) {
        WriteFile(dir_ / "@eaDir/a.txt@" + kind, {});
    }
    bool back = false;
    ASSERT_EQ(0, EASetSmbArchive(one.c_str()));
    Trace([&] {
        EAIndexFlags neither = {.fileIndex = 0, .index = 0};
        const bool from_other = std::exchange(back, !back);
        return MAVOEARename((from_other ? other : one).c_str(), (from_other ? one : other).c_str(),
                            1, &neither) == 0;
    });
    if (IsSkipped() || HasFatalFailure()) return;
    EXPECT_EQ(7u, calls_.size()) << PrintToString(calls_);
    EXPECT_EQ(0, Count({"open", "close", "fcntl"})) << PrintToString(calls_);
}

// A file is looked at by the upgrade, at both ends, and for the mode of the copy, which has it.
TEST_F(SystemCallsTest, CopyingOverMetadataInProcessTakesFourLooksAtEachFile) {
    const std::string from = dir_ / "a.txt";
    std::string to = dir_ / "b.txt";
    WriteFile(from, {});
    WriteFile(to, {});
    ASSERT_EQ(0, mkdir((dir_ / "@eaDir").c_str(), 0777));
    for (const char* kind : {MAVOEA_KIND_STREAM, MAVOEA_KIND_RESOURCE}) {
        WriteFile(dir_ / "@eaDir/a.txt@" + kind, Pattern(300));
    }
    const auto copy = [&](int (*copy_fn)(const char*, const char*)) {
        return MAVOEACopyEx(from.c_str(), to.data(), 0, 0, 1, 1, 0, 0, copy_fn);
    };
    ASSERT_EQ(0, copy([](const char* source, const char* target) {
                  WriteFile(target, ReadFile(source));
                  return 0;
              }));
    Trace([&] { return copy([](const char*, const char*) { return 0; }) == 0; });
    if (IsSkipped() || HasFatalFailure()) return;
    constexpr unsigned kLooks = 2 * 4;
    constexpr unsigned kLockedState = 4 + 3 + 1 + 3;  // flag and record at each end
    constexpr unsigned kFolderAndMark = 3;
    EXPECT_EQ(kLooks + kLockedState + kFolderAndMark, calls_.size()) << PrintToString(calls_);
    EXPECT_EQ(0, Count({"fchmod", "write", "mkdir"})) << PrintToString(calls_);
}

TEST_F(SystemCallsTest, ReadingOneValueOfAFewTakesAtMostEightAndTwoReads) {
    for (const int count : {1, 10, 100}) {
        SCOPED_TRACE(count);
        TraceReadingOneOf(count);
        if (IsSkipped() || HasFatalFailure()) return;
        EXPECT_LE(calls_.size(), 8u) << PrintToString(calls_);
        EXPECT_EQ(2, Reads()) << PrintToString(calls_);
    }
}

TEST_F(SystemCallsTest, ReadingOneValueOfAThousandTakesAtMostTenAndThreeReads) {
    TraceReadingOneOf(1000);
    if (IsSkipped() || HasFatalFailure()) return;
    EXPECT_LE(calls_.size(), 10u) << PrintToString(calls_);
    EXPECT_EQ(3, Reads()) << PrintToString(calls_);
}

TEST_F(SystemCallsTest, OverwritingASmallValueTakesOneWriteAndOneSync) {
    TraceOverwritingIn(ImageOf(10));
    if (IsSkipped() || HasFatalFailure()) return;
    EXPECT_EQ(1, Writes()) << PrintToString(calls_);
    EXPECT_EQ(1, Syncs()) << PrintToString(calls_);
    EXPECT_EQ(1, Count({"fsync"})) << PrintToString(calls_);
    EXPECT_LE(Reads(), 1) << PrintToString(calls_);
}

TEST_F(SystemCallsTest, OverwritingWithAsManyBytesDoesNotTouchTheResourceFork) {
    StreamImage image = ImageOf(10);
    image.fork = Pattern(100000);
    TraceOverwritingIn(image);
    if (IsSkipped() || HasFatalFailure()) return;
    EXPECT_EQ(1, Writes()) << PrintToString(calls_);
    EXPECT_EQ(1, Syncs()) << PrintToString(calls_);
    EXPECT_LE(Reads(), 1) << PrintToString(calls_);
    EXPECT_EQ(0, Count({"ftruncate"})) << PrintToString(calls_);
}

}  // namespace
}  // namespace mavoea::test

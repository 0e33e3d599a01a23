// Opening and closing EA streams, their locks, flushing, and counting attributes without a handle.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "tests/support/fake_platform.h"
#include "tests/support/freed_descriptor.h"
#include "tests/support/kernel_control.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_fixture.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

// The values are the platform's; callers pass the numbers.
static_assert(F_RDLCK == 0 && F_WRLCK == 1 && F_UNLCK == 2);

class EasHandleTest : public StreamTest {
 protected:
    static StreamImage Image() {
        return {.attributes = {{"a", Ascii("one")}, {"b", Ascii("two")}, {"c", Pattern(300)}},
                .fork = Pattern(1000),
                .finder_info = Pattern(32)};
    }
};

// ---- Open and close -----------------------------------------------------------------------------

// Promise: "MAVOEASOpen: Reads the stream"
// Promise: "MAVOEASClose: Frees h"
TEST_F(EasHandleTest, OpeningAnEmptyFileToWriteAndClosingItLeavesItEmpty) {
    EASHandle* const handle = MAVOEASOpen(fd_, F_WRLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(5, handle->capacity);
    EXPECT_EQ(F_WRLCK, handle->lockType);
    EXPECT_EQ(fd_, handle->fd);
    EXPECT_EQ(0, MAVOEASClose(handle));
    EXPECT_EQ(0u, FileSize());
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "offset: of the value's first byte"
// Promise: "length: of the value"
// Promise: "nameLength"
// Promise: "header: the file's first 120 bytes"
TEST_F(EasHandleTest, AnOpenHandleHoldsHeaderAndTableAsTheyAreOnDisk) {
    const StreamImage image = Image();
    const Bytes bytes = image.Build();
    Fill(bytes);
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    const HandleState expected{Bytes(bytes.begin(), bytes.begin() + 120),
                               {{168, 3, 0, 2, "a"}, {171, 3, 0, 2, "b"}, {174, 300, 0, 2, "c"}},
                               F_RDLCK};
    EXPECT_EQ(expected.header, StateOf(*handle).header);
    EXPECT_TRUE(expected == StateOf(*handle));
    EXPECT_EQ(3, handle->capacity);
    EXPECT_EQ(bytes, Contents());
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "MAVOEASOpen: Returns a handle"
TEST_F(EasHandleTest, ANegativeDescriptorIsRefused) {
    TakeCallNames();
    EXPECT_EQ(nullptr, MAVOEASOpen(-1, F_RDLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_open")));
    EXPECT_EQ(nullptr, MAVOEASOpen(-100, F_UNLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_open")));
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

TEST_F(EasHandleTest, Descriptor0IsAsGoodAsAnyOther) {
    Fill(Image());
    const FreedDescriptor standard_input(0);
    ASSERT_EQ(0, ::open(path_.c_str(), O_RDWR));
    EXPECT_EQ(3, EASGetEntryCount(0));
    {
        const Handle handle(MAVOEASOpen(0, F_WRLCK));
        ASSERT_NE(nullptr, handle);
        EXPECT_EQ(3, Write(handle, "a", "ONE"));
        EXPECT_EQ(0, MAVOEASTruncate(handle.get(), "c", 5));
        EXPECT_EQ(0, MAVOEASWriteHeader(handle.get()));
        EXPECT_EQ(Ascii("ONE"), Read(handle, "a"));
        EXPECT_EQ(Pattern(5), Read(handle, "c"));
        EXPECT_EQ(0, MAVOEASRemove(handle.get(), "a"));
    }
    const TempDir dir;
    const int other = ::open((dir / "other").c_str(), O_RDWR | O_CREAT, 0666);
    EXPECT_EQ(0, EASWriteToFd(0, other));
    EXPECT_EQ(2, EASGetEntryCount(other));
    EXPECT_EQ(0, EASWriteToFd(other, 0));
    EXPECT_EQ(2, EASGetEntryCount(0));
    ::close(other);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "mavoea.h: Ownership."
// Promise: "mavoea.h: The library closes only descriptors that it opened"
// Promise: "fd: owned by the caller"
// Promise: "MAVOEASOpen: it stays the caller's"
// Promise: "MAVOEASClose: the descriptor stays open"
TEST_F(EasHandleTest, ClosingLeavesTheDescriptorOpen) {
    Fill(Image());
    ASSERT_EQ(0, MAVOEASClose(MAVOEASOpen(fd_, F_WRLCK)));
    EXPECT_EQ(Image().Build(), Contents());
    EXPECT_THAT(TakeCallNames(), Not(Contains("close")));
    const Handle again = Open();
    EXPECT_NE(nullptr, again);
}

// Promise: "MAVOEASClose: -1 when"
TEST_F(EasHandleTest, ClosingNothingIsRefused) {
    EXPECT_EQ(-1, MAVOEASClose(nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_close")));
}

// Promise: "MAVOEASClose: -1 when"
TEST_F(EasHandleTest, ACloseThatCannotReleaseTheLockFreesTheHandleAllTheSame) {
    Fill(Image());
    const int live = TakeAllocations().live;
    EASHandle* const handle = MAVOEASOpen(fd_, F_RDLCK);
    ASSERT_NE(nullptr, handle);
    {
        const FailCall fault("setlock", ENOLCK);
        EXPECT_EQ(-1, MAVOEASClose(handle));
        EXPECT_EQ(ENOLCK, errno);
        EXPECT_TRUE(fault.fired());
    }
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    EXPECT_EQ(live, TakeAllocations().live);
}

// Promise: "MAVOEASOpen: Reads the stream"
TEST_F(EasHandleTest, AHandleWithoutALockSearchesAndEnumeratesOnly) {
    Fill(Image());
    const Handle handle = Open(F_UNLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
    EXPECT_THAT(Names(handle), ElementsAre("a", "b", "c"));
    EXPECT_EQ(1, MAVOEASSearch(handle.get(), "b"));
    EXPECT_THAT(TakeRecords(), IsEmpty());

    char buffer[8];
    EXPECT_EQ(-1, MAVOEASRead(handle.get(), "a", buffer, sizeof buffer, 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x300, "eas_read")));
    EXPECT_EQ(-1, Write(handle, "a", "x"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x300, "eas_write")));
    EXPECT_EQ(-1, MAVOEASRemove(handle.get(), "a"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x300, "eas_remove")));
    EXPECT_EQ(-1, MAVOEASTruncate(handle.get(), "a", 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x300, "eas_truncate")));
    EXPECT_EQ(Image().Build(), Contents());
}

TEST_F(EasHandleTest, AHandleWithoutALockReleasesNoneWhenItIsClosed) {
    Fill(Image());
    EASHandle* const handle = MAVOEASOpen(fd_, F_UNLCK);
    ASSERT_NE(nullptr, handle);
    TakeCallNames();
    EXPECT_EQ(0, MAVOEASClose(handle));
    EXPECT_THAT(TakeCallNames(), Not(Contains("setlock")));
}

// Promise: "MAVOEASOpen: 0xA00"
// Promise: "EA stream: **Damage**"
// Promise: "Streams: A stream whose header"
TEST_F(EasHandleTest, AShortFileIsRefusedAtEveryLengthWithoutALockLeft) {
    const StreamImage image = Image();
    const Bytes bytes = image.Build();
    // The last record's padding is skipped, not read.
    const std::size_t table_end = image.RecordAt(2) + 11 + 2;
    const int live = TakeAllocations().live;
    for (std::size_t length = 1; length < table_end; ++length) {
        SCOPED_TRACE(length);
        Fill(Bytes(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length)));
        TakeCalls();
        EXPECT_EQ(nullptr, MAVOEASOpen(fd_, F_WRLCK));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_open")));
        EXPECT_EQ("setlock(2)", TakeCalls().back());
        EXPECT_EQ(length, FileSize());
        EXPECT_EQ(live, TakeAllocations().live);
    }
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
    // From here on only values and fork are missing, which opening does not read.
    for (std::size_t length = table_end; length <= bytes.size(); ++length) {
        Fill(Bytes(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length)));
        EXPECT_NE(nullptr, Open()) << length;
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasHandleTest, TheFileIsReadInOneOrTwoReads) {
    Fill(Image());
    TakeCalls();
    Handle handle = Open(F_RDLCK);
    EXPECT_THAT(TakeCalls(), ElementsAre("setlock(0)", "pread(8192, 0)"));
    handle.reset();
    TakeCalls();

    StreamImage image;
    for (int i = 0; i < 1000; ++i) image.attributes.push_back({"name" + std::to_string(i), {}});
    Fill(image);
    handle = Open(F_RDLCK);
    EXPECT_THAT(TakeCallNames(), ElementsAre("setlock", "pread", "lseek", "pread"));
    EXPECT_EQ(1000, U16At(handle->header, kAttributeCountAt));
}

TEST_F(EasHandleTest, ALargeTableMayEndWithTheFile) {
    // Records without padding, of values without bytes; only the last is not among the first bytes
    // that are read.
    StreamImage image;
    for (int i = 1000; i < 1404; ++i) image.attributes.push_back({"name" + std::to_string(i), {}});
    ASSERT_EQ(120u + 404 * 20, image.Build().size());
    Fill(image);
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(403, MAVOEASSearch(handle.get(), "name1403"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasHandleTest, ReadsThatComeBackShortButNotEmptyAreGoneOnWith) {
    Fill(Image());
    const ShortCall fault("pread", 1, 70, true);
    const Handle handle = Open(F_RDLCK);
    EXPECT_TRUE(fault.fired());
    ASSERT_NE(nullptr, handle);
    EXPECT_THAT(Names(handle), ElementsAre("a", "b", "c"));
}

TEST_F(EasHandleTest, OneTenAHundredAndAThousandAttributesAreReadInAtMostEightCalls) {
    struct Case {
        int attributes;
        std::size_t calls;  // the caller's own open and close among them
    };
    for (const Case& c : {Case{1, 6}, Case{10, 6}, Case{100, 6}, Case{1000, 8}}) {
        SCOPED_TRACE(c.attributes);
        StreamImage image;
        for (int i = 0; i < c.attributes; ++i) {
            image.attributes.push_back({"user.name" + std::to_string(i), Ascii("value")});
        }
        Fill(image);
        TakeCallNames();
        EASHandle* const handle = MAVOEASOpen(fd_, F_RDLCK);
        ASSERT_NE(nullptr, handle);
        char buffer[16];
        EXPECT_EQ(5, MAVOEASRead(handle, "user.name0", buffer, sizeof buffer, 0));
        EXPECT_EQ(0, MAVOEASClose(handle));
        EXPECT_LE(TakeCallNames().size() + 2, c.calls);
    }
}

// What each call of an open that fails makes of it.
int CodeOfOpenFailure(const std::string& call) {
    if (call == "malloc") return 0x200;
    if (call == "setlock") return 0x400;
    return 0xA00;
}

// Promise: "mavoea.h: elsewhere a failure leaves the `errno`"
// Promise: "MAVOEASOpen: 0x200"
// Promise: "mavoea.h: Results."
TEST_F(EasHandleTest, EveryFailingCallOfAnOpenIsRecordedOnceAndLeavesNothingBehind) {
    StreamImage long_table;
    for (int i = 0; i < 600; ++i) long_table.attributes.push_back({"name" + std::to_string(i), {}});
    struct Case {
        Bytes bytes;
        bool beside_another;  // which has taken what the library keeps for one large stream
    };
    for (const auto& [bytes, beside_another] :
         {Case{{}, false}, Case{PlainAppleDouble(Pattern(32), Pattern(9)), false},
          Case{Image().Build(), false}, Case{long_table.Build(), false},
          Case{long_table.Build(), true}}) {
        SCOPED_TRACE(bytes.size());
        Fill(bytes);
        const Handle other = beside_another ? Open(F_UNLCK) : nullptr;
        const int live = TakeAllocations().live;
        for (int nth = 1;; ++nth) {
            SCOPED_TRACE(nth);
            EASHandle* handle = nullptr;
            std::string failed;
            int error = 0;
            TakeCalls();
            {
                const FailNthCall fault(nth, EIO);
                handle = MAVOEASOpen(fd_, F_WRLCK);
                error = errno;
                failed = fault.name();
            }
            if (failed.empty() || failed == "pread") {  // what is needed is read again
                ASSERT_NE(nullptr, handle);
                EXPECT_EQ(F_WRLCK, LockInTheWay(path_, F_RDLCK));
                EXPECT_EQ(0, MAVOEASClose(handle));
                EXPECT_THAT(TakeRecords(), IsEmpty());
                if (failed.empty()) break;
                continue;
            }
            EXPECT_EQ(nullptr, handle);
            EXPECT_EQ(EIO, error);
            const std::vector<Record> records = TakeRecords();
            ASSERT_EQ(1u, records.size());
            EXPECT_EQ(CodeOfOpenFailure(failed), records[0].code) << failed;
            EXPECT_THAT(records[0].unit, failed == "setlock"
                                             ? ::testing::Matcher<std::string>("eas_lock_set")
                                             : AnyOf("eas_open", "eas_alloc_entry"));
            EXPECT_EQ(live, TakeAllocations().live);
            const std::vector<std::string> calls = TakeCalls();
            if (failed != "setlock" && !calls.empty()) {
                EXPECT_EQ("setlock(2)", calls.back());
            }
            EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
        }
        EXPECT_EQ(bytes, Contents());
        TakeAllocations();
        EXPECT_NE(nullptr, Open(F_UNLCK));
        EXPECT_EQ(beside_another, TakeAllocations().largest >= 1024);
    }
}

// A disk that cannot read some of a file fails every read that touches it.
class UnreadableFrom {
 public:
    explicit UnreadableFrom(unsigned long long first) {
        Hooks().fails = [first](const std::string& call) {
            unsigned long long size = 0;
            unsigned long long at = 0;
            const bool read = sscanf(call.c_str(), "pread(%llu, %llu)", &size, &at) == 2;
            return read && at + size > first ? EIO : 0;
        };
    }
    ~UnreadableFrom() { Hooks().fails = nullptr; }
    UnreadableFrom(const UnreadableFrom&) = delete;
    UnreadableFrom& operator=(const UnreadableFrom&) = delete;
};

// Promise: "EA stream: Any other stream opens"
// Promise: "Streams: Others open"
TEST_F(EasHandleTest, ValuesThatCannotBeReadAreNoReasonToRefuseAStream) {
    StreamImage large;
    for (int i = 0; i < 600; ++i) large.attributes.push_back({"name" + std::to_string(i), {}});
    large.attributes.push_back({"value", Pattern(500)});
    StreamImage gap = Image();  // behind the table, which is then shorter than the header says
    gap.gap = 256;
    for (const StreamImage& image : {Image(), gap, large}) {
        const Bytes bytes = image.Build();
        const std::size_t table_end = kTableAt + image.TableSize();
        Fill(bytes);
        for (const bool damaged : {false, true}) {
            SCOPED_TRACE(bytes.size());
            if (damaged) {
                Bytes wrong = bytes;
                PutU32(wrong, kDataStartAt, 0);  // The header does not tell how long the table is.
                Fill(wrong);
            }
            const std::size_t last = image.attributes.size() - 1;
            const std::size_t needed =
                image.RecordAt(last) + 11 + image.attributes[last].name.size() + 1;
            for (const std::size_t first : {needed, table_end}) {
                const UnreadableFrom fault(first);
                const Handle handle = Open(F_RDLCK);
                ASSERT_NE(nullptr, handle);
                EXPECT_EQ(last + 1, Names(handle).size());
                EXPECT_EQ(image.attributes[last].name, handle->entries[last].name);
            }
            {
                const UnreadableFrom fault(needed - 1);
                EXPECT_EQ(nullptr, Open(F_RDLCK));
                EXPECT_EQ(EIO, errno);
                EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_open")));
            }
            {
                const UnreadableFrom fault(kTableAt);
                EXPECT_EQ(static_cast<int>(last) + 1, EASGetEntryCount(fd_));
            }
            for (const std::size_t first : {0u, 25u, 49u, 81u, 119u}) {
                SCOPED_TRACE(first);
                const UnreadableFrom fault(first);
                EXPECT_EQ(-1, EASGetEntryCount(fd_));
                EXPECT_EQ(EIO, errno);
                EXPECT_EQ(nullptr, Open(F_RDLCK));
                EXPECT_EQ(EIO, errno);
                EXPECT_THAT(TakeRecords(),
                            ElementsAre(RecordOf(0xA00, "eas_open"), RecordOf(0xA00, "eas_open")));
            }
        }
    }
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
}

// Promise: "MAVOEASOpen: fd must be open"
// Promise: "MAVOEASOpen: 0xA00"
TEST_F(EasHandleTest, ADescriptorThatCannotBeReadIsAReadFailure) {
    Fill(Image());
    const int fd = ::open(path_.c_str(), O_WRONLY);
    ASSERT_GE(fd, 0);
    EXPECT_EQ(nullptr, MAVOEASOpen(fd, F_WRLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_open")));
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
    ::close(fd);
}

// Promise: "MAVOEASOpen: fd must be open"
TEST_F(EasHandleTest, AWriteLockNeedsADescriptorToWriteTo) {
    Fill(Image());
    const int fd = ::open(path_.c_str(), O_RDONLY);
    ASSERT_GE(fd, 0);
    EXPECT_EQ(nullptr, MAVOEASOpen(fd, F_WRLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    ::close(fd);
}

// ---- Locks --------------------------------------------------------------------------------------

// Promise: "MAVOEASOpen: Reads the stream"
TEST_F(EasHandleTest, ReadersShareAStreamBetweenProcesses) {
    Fill(Image());
    OtherProcess first(path_, F_RDLCK);
    OtherProcess second(path_, F_RDLCK);
    EXPECT_EQ(0, first.code());
    EXPECT_EQ(0, second.code());
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(Ascii("two"), Read(handle, "b"));
}

// Promise: "MAVOEASOpen: Reads the stream"
// Promise: "MAVOEASOpen: 0x400"
TEST_F(EasHandleTest, AWriterInAnotherProcessKeepsReadersAndWritersOutAtOnce) {
    Fill(Image());
    OtherProcess writer(path_, F_WRLCK);
    ASSERT_EQ(0, writer.code());
    const int live = TakeAllocations().live;
    for (const int lock_type : {F_RDLCK, F_WRLCK}) {
        SCOPED_TRACE(lock_type);
        EXPECT_EQ(nullptr, Open(lock_type));
        EXPECT_THAT(errno, AnyOf(EAGAIN, EACCES));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
        EXPECT_EQ(live, TakeAllocations().live);
    }
    EXPECT_NE(nullptr, Open(F_UNLCK));  // which asks for no lock
    EXPECT_EQ(-1, EASGetEntryCount(fd_));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));

    writer.Release();
    EXPECT_NE(nullptr, Open(F_WRLCK));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasHandleTest, AReaderInAnotherProcessKeepsWritersOutAtOnce) {
    Fill(Image());
    OtherProcess reader(path_, F_RDLCK);
    ASSERT_EQ(0, reader.code());
    EXPECT_EQ(nullptr, Open(F_WRLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    EXPECT_EQ(3, EASGetEntryCount(fd_));
    reader.Release();
    EXPECT_NE(nullptr, Open(F_WRLCK));
}

// Promise: "MAVOEASClose: Frees h"
TEST_F(EasHandleTest, ThisProcessKeepsOthersOutUntilItCloses) {
    Fill(Image());
    Handle handle = Open(F_WRLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(0x400, OtherProcess(path_, F_RDLCK).code());
    EXPECT_EQ(0x400, OtherProcess(path_, F_WRLCK).code());
    EXPECT_EQ(0, OtherProcess(path_, F_UNLCK).code());
    handle.reset();
    EXPECT_EQ(0, OtherProcess(path_, F_WRLCK).code());

    handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(0, OtherProcess(path_, F_RDLCK).code());
    EXPECT_EQ(0x400, OtherProcess(path_, F_WRLCK).code());
}

TEST_F(EasHandleTest, TheLockIsDroppedWhenAStreamIsRefused) {
    Bytes bytes = Image().Build();
    PutU16(bytes, kDescriptorCountAt, 14);
    Fill(bytes);
    EXPECT_EQ(nullptr, Open(F_WRLCK));
    EXPECT_THAT(TakeCodes(), ElementsAre(0xD00));
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
}

// Promise: "MAVOEASOpen: Reads the stream"
TEST_F(EasHandleTest, TheLockCoversTheFileHoweverItGrows) {
    const Handle handle = Open(F_WRLCK);
    ASSERT_NE(nullptr, handle);
    struct flock64 asked = {};
    asked.l_type = F_RDLCK;
    asked.l_whence = SEEK_SET;
    asked.l_start = 1000000000;
    asked.l_len = 1;
    const pid_t child = fork();
    if (child == 0) {
        const int fd = ::open(path_.c_str(), O_RDWR);
        const bool blocked = fcntl(fd, F_GETLK64, &asked) == 0 && asked.l_type == F_WRLCK &&
                             asked.l_start == 0 && asked.l_len == 0;
        _exit(blocked ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(child, waitpid(child, &status, 0));
    EXPECT_EQ(0, status);
}

// Promise: "lockType"
// Promise: "MAVOEASLockSet: Changes"
TEST_F(EasHandleTest, TheLockIsChangedAndTheHandleKnows) {
    Fill(Image());
    const Handle handle = Open(F_UNLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(0, MAVOEASLockSet(handle.get(), F_RDLCK));
    EXPECT_EQ(F_RDLCK, handle->lockType);
    EXPECT_EQ(F_RDLCK, LockInTheWay(path_, F_WRLCK));
    EXPECT_EQ(Ascii("one"), Read(handle, "a"));
    EXPECT_EQ(0, MAVOEASLockSet(handle.get(), F_WRLCK));
    EXPECT_EQ(F_WRLCK, handle->lockType);
    EXPECT_EQ(F_WRLCK, LockInTheWay(path_, F_RDLCK));
    EXPECT_EQ(1, Write(handle, "a", "1"));
    EXPECT_EQ(0, MAVOEASLockSet(handle.get(), F_UNLCK));
    EXPECT_EQ(F_UNLCK, handle->lockType);
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
    EXPECT_EQ(-1, Write(handle, "a", "2"));
    EXPECT_THAT(TakeCodes(), ElementsAre(0x300));
}

// Promise: "MAVOEASLockSet: 0x400"
TEST_F(EasHandleTest, ALockThatIsNotGrantedLeavesTheOldOne) {
    Fill(Image());
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    OtherProcess reader(path_, F_RDLCK);
    ASSERT_EQ(0, reader.code());
    EXPECT_EQ(-1, MAVOEASLockSet(handle.get(), F_WRLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    EXPECT_EQ(F_RDLCK, handle->lockType);
    reader.Release();
    EXPECT_EQ(F_RDLCK, LockInTheWay(path_, F_WRLCK));
}

// Promise: "MAVOEASOpen: 0x400"
// Promise: "MAVOEASLockSet: 0x400"
TEST_F(EasHandleTest, ALockThatTheKernelDoesNotKnowOrTheDescriptorDoesNotAllowIsRefused) {
    Fill(Image());
    EXPECT_EQ(nullptr, Open(77));
    EXPECT_EQ(EINVAL, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    const Handle handle = Open(F_WRLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(-1, MAVOEASLockSet(handle.get(), 77));
    EXPECT_EQ(EINVAL, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    EXPECT_EQ(F_WRLCK, handle->lockType);

    const int reads = open(path_.c_str(), O_RDONLY | O_CLOEXEC);
    EXPECT_EQ(nullptr, MAVOEASOpen(reads, F_WRLCK));
    EXPECT_EQ(EBADF, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    EASHandle* const reader = MAVOEASOpen(reads, F_RDLCK);
    ASSERT_NE(nullptr, reader);
    EXPECT_EQ(-1, MAVOEASLockSet(reader, F_WRLCK));
    EXPECT_EQ(EBADF, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x400, "eas_lock_set")));
    EXPECT_EQ(F_RDLCK, reader->lockType);
    EXPECT_EQ(0, MAVOEASClose(reader));
    close(reads);
}

// Promise: "MAVOEASLockSet: The file is not read again"
TEST_F(EasHandleTest, AWriteUnderALateLockLosesWhatAnotherHasWrittenBefore) {
    StreamImage image = Image();
    Fill(image.Build());
    const Handle late = Open(F_UNLCK);
    ASSERT_NE(nullptr, late);
    {
        const Handle other = Open();
        ASSERT_NE(nullptr, other);
        EXPECT_EQ(6, Write(other, "theirs", "theirs"));
    }
    EXPECT_EQ(0, MAVOEASLockSet(late.get(), F_WRLCK));
    EXPECT_THAT(Names(late), ElementsAre("a", "b", "c"));
    EXPECT_EQ(4, Write(late, "mine", "mine"));
    EXPECT_THAT(Names(Open()), ElementsAre("a", "b", "c", "mine"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "MAVOEASOpen: Beware"
TEST_F(EasHandleTest, ClosingAnotherDescriptorOfTheFileDropsTheLock) {
    const Handle handle = Open(F_WRLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(F_WRLCK, LockInTheWay(path_, F_WRLCK));
    ::close(::open(path_.c_str(), O_RDONLY));
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
    EXPECT_EQ(F_WRLCK, handle->lockType);
}

// Promise: "MAVOEASLockGet: 0xD00"
// Promise: "MAVOEASLockSet: 0xD00"
TEST_F(EasHandleTest, LocksWithoutAHandleOrDescriptorAreRefused) {
    EXPECT_EQ(-1, MAVOEASLockSet(nullptr, F_RDLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_lock_set")));
    struct flock64 lock = {};
    EXPECT_EQ(-1, MAVOEASLockGet(nullptr, &lock));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_lock_get")));

    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(-1, MAVOEASLockGet(handle.get(), nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_lock_get")));
    handle->fd = -1;
    EXPECT_EQ(-1, MAVOEASLockGet(handle.get(), &lock));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_lock_get")));
    EXPECT_EQ(-1, MAVOEASLockSet(handle.get(), F_WRLCK));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_lock_set")));
    EXPECT_EQ(F_RDLCK, handle->lockType);
    handle->fd = fd_;
}

// Promise: "MAVOEASLockGet: Asks"
TEST_F(EasHandleTest, TheKernelIsAskedAboutALock) {
    Fill(Image());
    const Handle handle = Open(F_UNLCK);
    ASSERT_NE(nullptr, handle);
    struct flock64 lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    EXPECT_EQ(0, MAVOEASLockGet(handle.get(), &lock));
    EXPECT_EQ(F_UNLCK, lock.l_type);

    OtherProcess reader(path_, F_RDLCK);
    ASSERT_EQ(0, reader.code());
    lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    EXPECT_EQ(0, MAVOEASLockGet(handle.get(), &lock));
    EXPECT_EQ(F_RDLCK, lock.l_type);
    EXPECT_EQ(reader.pid(), lock.l_pid);
    EXPECT_EQ(F_UNLCK, handle->lockType);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// Promise: "MAVOEASLockGet: 0xD00"
TEST_F(EasHandleTest, AQuestionThatTheKernelRefusesIsASystemCallFailure) {
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    struct flock64 lock = {};
    lock.l_type = F_WRLCK;
    const FailCall fault("getlock", EINVAL);
    EXPECT_EQ(-1, MAVOEASLockGet(handle.get(), &lock));
    EXPECT_EQ(EINVAL, errno);
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "eas_lock_get")));
}

// ---- Flush --------------------------------------------------------------------------------------

// Promise: "MAVOEASFlush: fsync(2)"
// Promise: "MAVOEASFlush: 0xD00"
TEST_F(EasHandleTest, FlushingSyncsTheDescriptor) {
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    TakeCallNames();
    EXPECT_EQ(0, MAVOEASFlush(handle.get()));
    EXPECT_THAT(TakeCallNames(), ElementsAre("fsync"));
    {
        const FailCall fault("fsync", EIO);
        EXPECT_EQ(-1, MAVOEASFlush(handle.get()));
        EXPECT_EQ(EIO, errno);
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "eas_flush")));
    }
    handle->fd = -1;
    EXPECT_EQ(-1, MAVOEASFlush(handle.get()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_flush")));
    handle->fd = fd_;
    EXPECT_EQ(-1, MAVOEASFlush(nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_flush")));
}

// ---- Entry count --------------------------------------------------------------------------------

TEST_F(EasHandleTest, AttributesAreCountedWithoutTheTable) {
    EXPECT_EQ(0, EASGetEntryCount(fd_));
    EXPECT_EQ(0u, FileSize());
    Fill(PlainAppleDouble(Pattern(32), Pattern(10)));
    EXPECT_EQ(0, EASGetEntryCount(fd_));
    const Bytes bytes = Image().Build();
    Fill(bytes);
    EXPECT_EQ(3, EASGetEntryCount(fd_));
    // Only the 120 bytes in front are looked at.
    Fill(Bytes(bytes.begin(), bytes.begin() + 120));
    EXPECT_EQ(3, EASGetEntryCount(fd_));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    for (std::size_t length = 1; length < 120; ++length) {
        Fill(Bytes(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length)));
        EXPECT_EQ(-1, EASGetEntryCount(fd_)) << length;
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_open"))) << length;
    }
    EXPECT_EQ(-1, EASGetEntryCount(-1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_open")));
}

// ---- Tables of any size -------------------------------------------------------------------------

// Reading goes on in steps of 64 KiB where the header does not tell how long the table is: the last
// record may begin in one step and end the file in the next.
TEST_F(EasHandleTest, ATableThatTheHeaderDoesNotMeasureIsReadToTheFilesEnd) {
    StreamImage image;
    while (image.TableSize() + RecordSize(205) <= 64u << 10) {
        const std::size_t number = 1000 + image.attributes.size();
        image.attributes.push_back({std::string(200, 'n') + std::to_string(number), {}});
    }
    for (std::size_t length = 1; length < 254; ++length) {
        StreamImage whole = image;
        whole.attributes.push_back({std::string(length, 'x'), {}});
        Bytes bytes = whole.Build();
        bytes.resize(whole.RecordAt(whole.attributes.size() - 1) + 11 + length + 1);
        PutU32(bytes, kDataStartAt, 0);
        Fill(bytes);
        const Handle handle = Open(F_RDLCK);
        ASSERT_NE(nullptr, handle) << length;
        EXPECT_EQ(static_cast<int>(whole.attributes.size()) - 1,
                  MAVOEASSearch(handle.get(), std::string(length, 'x').c_str()));
    }
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasHandleTest, WhatAHeaderThatSaysTooMuchHasHadReadIsGivenBack) {
    StreamImage image;
    for (int i = 0; i < 600; ++i) image.attributes.push_back({"name" + std::to_string(i), {}});
    Bytes bytes = image.Build();
    PutU32(bytes, kDataStartAt, 1 << 20);
    bytes.resize(2 << 20);
    Fill(bytes);
    const Allocations before = TakeAllocations();
    const Handle handle = Open(F_RDLCK);
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(600u, Names(handle).size());
    EXPECT_EQ(599, MAVOEASSearch(handle.get(), "name599"));
    const Allocations after = TakeAllocations();
    EXPECT_LT(1'000'000u, after.largest);
    EXPECT_GT(before.live_bytes + 600 * sizeof(EASEntry) + bytes.size() / 64, after.live_bytes);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasHandleTest, CountingHoldsAReadLockMeanwhile) {
    Fill(Image());
    TakeCalls();
    EXPECT_EQ(3, EASGetEntryCount(fd_));
    const std::vector<std::string> calls = TakeCalls();
    ASSERT_GE(calls.size(), 3u);
    EXPECT_EQ("setlock(0)", *std::find(calls.begin(), calls.end(), "setlock(0)"));
    EXPECT_EQ("setlock(2)", calls.back());
    EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
}

TEST_F(EasHandleTest, EveryFailingCallOfACountIsRecordedOnceAndLeavesNothingBehind) {
    Fill(Image());
    const int live = TakeAllocations().live;
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        int count = 0;
        std::string failed;
        TakeCalls();
        {
            const FailNthCall fault(nth, EIO);
            count = EASGetEntryCount(fd_);
            failed = fault.name();
        }
        EXPECT_EQ(live, TakeAllocations().live);
        const std::vector<std::string> calls = TakeCalls();
        if (failed.empty()) {
            EXPECT_EQ(3, count);
            break;
        }
        if (failed == "setlock" && calls.back() == "setlock(2)") {
            // The count was taken; only the release failed, for which no result is laid down.
            EXPECT_THAT(TakeCodes(), ElementsAre(0x400));
            EXPECT_EQ(3, EASGetEntryCount(fd_));  // which drops it
            continue;
        }
        if (failed == "pread") {  // what is needed is read again
            EXPECT_EQ(3, count);
            EXPECT_THAT(TakeCodes(), IsEmpty());
            continue;
        }
        EXPECT_EQ(-1, count);
        EXPECT_THAT(TakeCodes(), ElementsAre(CodeOfOpenFailure(failed))) << failed;
        EXPECT_EQ(F_UNLCK, LockInTheWay(path_, F_WRLCK));
    }
}

}  // namespace
}  // namespace mavoea::test

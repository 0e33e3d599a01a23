// Every call that fails while streams are opened, read, rewritten and closed, and while AppleDouble
// files are checked, imported and repaired.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "tests/support/fault_sweep.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

using Names = std::vector<const char*>;

// ---- Streams and handles ----

constexpr char kFile[] = "s";

StreamImage ThreeAttributes(std::size_t fork_size) {
    return {.attributes = {{"first", Pattern(40, 1)}, {"second", Pattern(700, 2)}, {"third", {}}},
            .fork = Pattern(fork_size, 3)};
}

void OpenFile(FaultWorld& w, const Bytes& bytes) {
    WriteFile(w / kFile, bytes);
    w.fd = ::open((w / kFile).c_str(), O_RDWR | O_CLOEXEC);
    ASSERT_GE(w.fd, 0);
}

void OpenStream(FaultWorld& w, const Bytes& bytes, int lock = F_WRLCK) {
    OpenFile(w, bytes);
    w.handle = MAVOEASOpen(w.fd, lock);
    ASSERT_NE(nullptr, w.handle);
}

void CloseAll(FaultWorld& w) {
    for (EASHandle** handle : {&w.handle, &w.other_handle}) {
        if (*handle != nullptr) MAVOEASClose(*handle);
        *handle = nullptr;
    }
    for (int* fd : {&w.fd, &w.other_fd}) {
        if (*fd >= 0) ::close(*fd);
        *fd = -1;
    }
    if (w.list != nullptr) MLIBCSzListFree(w.list);
    w.list = nullptr;
}

// What the handle knows: header, table and lock.
std::string HandleText(FaultWorld& w) {
    if (w.handle == nullptr) return "no handle";
    const EASHandle& h = *w.handle;
    std::string text(reinterpret_cast<const char*>(h.header), 120);
    for (unsigned i = 0; i < U16At({h.header, 120}, kAttributeCountAt); ++i) {
        const EASEntry& entry = h.entries[i];
        text += std::to_string(entry.offset) + " " + std::to_string(entry.length) + " " +
                std::to_string(entry.flags) + " " + std::to_string(entry.nameLength) + " " +
                entry.name + "\n";
    }
    return text + "lock " + std::to_string(h.lockType);
}

// A case about one call on a handle of a stream of `bytes`.
FaultCase OnHandle(const char* name, const Bytes& bytes,
                   std::function<long long(FaultWorld&)> run) {
    return {.name = name,
            .prepare = [bytes](FaultWorld& w) { OpenStream(w, bytes); },
            .run = std::move(run),
            .finish = CloseAll,
            .state = HandleText};
}

// Any failure of `call` that is not taken up again: the record, and nothing changed.
FaultRule Refused(const char* call, ExpectedRecord record, int ordinal = 0) {
    return {.call = call, .ordinal = ordinal, .outcome = {.result = -1, .records = {record}}};
}

// ---- Open, close, lock, flush ----

FaultCase Opening(const char* name, const Bytes& bytes, int lock) {
    return {.name = name,
            .prepare = [bytes](FaultWorld& w) { OpenFile(w, bytes); },
            .run =
                [lock](FaultWorld& w) {
                    w.handle = MAVOEASOpen(w.fd, lock);
                    return w.handle == nullptr ? -1 : 0;
                },
            .finish = CloseAll,
            .check =
                [lock](FaultWorld& w, const FaultRun& run) {
                    if (run.expected == nullptr) return;  // The release itself may have failed.
                    EXPECT_EQ(run.result == 0 && lock != F_UNLCK, HoldsLock(w / kFile));
                }};
}

const ExpectedRecord kOpenMemory = {0x200, "eas_open"};
const ExpectedRecord kOpenRead = {0xA00, "eas_open"};
const ExpectedRecord kTableMemory = {0x200, "eas_alloc_entry"};
const ExpectedRecord kLock = {0x400, "eas_lock_set"};

// A read of more than is needed fails: what is needed is read by itself.
FaultRule ReadByItself(const char* with, long long result = 0) {
    return {
        .call = "pread", .with = with, .errors = {EIO, kNoneOnce}, .outcome = {.result = result}};
}

// Any failure while the stream in kFile is read.
Rules Reading(long long result) {
    return {TakenUpAgain("pread", result), ReadByItself("", result), Refused("pread", kOpenRead)};
}

const Rules kOpenFailures = {Refused("malloc", kOpenMemory, 1), Refused("malloc", kTableMemory, 2),
                             Refused("malloc", kOpenMemory), Refused("setlock", kLock)};

// `bytes` are half of the file and hold header and table: that the rest is missing does not show.
FaultRule HalfIsEnough(size_t bytes, long long result = 0) {
    return {
        .call = "pread", .errors = {kShortThenNone}, .bytes = bytes, .outcome = {.result = result}};
}

TEST(StreamOpenFaults, ANewStreamOpensOrLeavesNeitherMemoryNorLock) {
    FaultCase c = Opening("open a new stream", {}, F_WRLCK);
    c.rules = {Refused("malloc", kOpenMemory, 1), Refused("malloc", kTableMemory, 2),
               Refused("setlock", kLock),         Refused("lseek", kOpenRead),
               TakenUpAgain("pread", 0),          ReadByItself("")};
    SweepFaults(c);
}

// Promise: "MAVOEASOpen: 0x200"
TEST(StreamOpenFaults, AStreamOpensOrLeavesNeitherMemoryNorLock) {
    FaultCase c = Opening("open a stream", ThreeAttributes(5000).Build(), F_RDLCK);
    c.rules = Rules{HalfIsEnough(2960)} + kOpenFailures + Reading(0);
    SweepFaults(c);
}

TEST(StreamOpenFaults, WithoutALockThereIsNoneToGetOrRelease) {
    FaultCase c = Opening("open a stream without a lock", ThreeAttributes(0).Build(), F_UNLCK);
    c.rules = Rules{HalfIsEnough(460)} + kOpenFailures + Reading(0);
    SweepFaults(c);
}

TEST(StreamOpenFaults, ALargeTableIsReadInPartsAndFreedInWhole) {
    StreamImage image;
    for (int i = 0; i < 3000; ++i) {
        image.attributes.push_back({"attribute of a long name, number " + std::to_string(i), {}});
    }
    Bytes bytes = image.Build();
    // A name without its NUL is copied.
    const std::size_t name_end = image.RecordAt(5) + 11 + image.attributes[5].name.size();
    bytes[name_end] = '!';
    FaultCase c = Opening("open a stream of 3,000 attributes", bytes, F_WRLCK);
    c.rules = Rules{Refused("malloc", kTableMemory, 3),
                    Refused("malloc", kOpenMemory),
                    Refused("setlock", kLock),
                    Refused("lseek", kOpenRead),
                    // The file seems to end while its table is read.
                    {.call = "pread",
                     .with = ", 8192)",
                     .errors = {kNoneOnce},
                     .outcome = {.result = -1, .records = {kOpenRead}}}} +
              Reading(0);
    SweepFaults(c);
}

TEST(StreamOpenFaults, AHeaderThatCannotBeReadAgainIsRefused) {
    // The Finder info lies behind all that is read at first.
    Bytes bytes = PlainAppleDouble(Repeat(0x46, 32), Pattern(20'000));
    PutU32(bytes, kFinderOffsetAt, 19'000);
    FaultCase c = Opening("open a stream, Finder info far behind", bytes, F_RDLCK);
    c.rules = {Refused("malloc", kOpenMemory, 1),
               Refused("malloc", kTableMemory, 2),
               Refused("setlock", kLock),
               TakenUpAgain("pread", 0),
               ReadByItself(", 0)"),
               Refused("pread", kOpenRead)};
    SweepFaults(c);
}

TEST(StreamCloseFaults, AHandleIsFreedAlsoWhenItsLockCannotBeReleased) {
    SweepFaults({.name = "close",
                 .prepare = [](FaultWorld& w) { OpenStream(w, ThreeAttributes(0).Build()); },
                 .run =
                     [](FaultWorld& w) {
                         EASHandle* const handle = w.handle;
                         w.handle = nullptr;
                         return MAVOEASClose(handle);
                     },
                 .finish = CloseAll,
                 .rules = {Refused("setlock", kLock)}});
}

TEST(StreamLockFaults, ALockThatCannotBeSetLeavesTheHandleAsItWas) {
    FaultCase c = OnHandle("set a lock", ThreeAttributes(0).Build(),
                           [](FaultWorld& w) { return MAVOEASLockSet(w.handle, F_RDLCK); });
    c.rules = {Refused("setlock", kLock)};
    SweepFaults(c);
    c.name = "release a lock";
    c.run = [](FaultWorld& w) { return MAVOEASLockSet(w.handle, F_UNLCK); };
    SweepFaults(c);
}

TEST(StreamLockFaults, AQueryThatFailsIsRecorded) {
    FaultCase c = OnHandle("ask for a lock", ThreeAttributes(0).Build(), [](FaultWorld& w) {
        struct flock64 lock = {};
        lock.l_type = F_WRLCK;
        lock.l_whence = SEEK_SET;
        return MAVOEASLockGet(w.handle, &lock);
    });
    c.rules = {Refused("getlock", {0x2A00, "eas_lock_get"})};
    SweepFaults(c);
}

TEST(StreamFlushFaults, AFailedFsyncIsRecordedAndNeverTriedAgain) {
    FaultCase c = OnHandle("flush", ThreeAttributes(0).Build(),
                           [](FaultWorld& w) { return MAVOEASFlush(w.handle); });
    c.rules = {Refused("fsync", {0x2A00, "eas_flush"})};
    SweepFaults(c);
}

TEST(StreamCountFaults, ACountLeavesNoLock) {
    FaultCase c = {.name = "count attributes",
                   .prepare = [](FaultWorld& w) { OpenFile(w, ThreeAttributes(5000).Build()); },
                   .run = [](FaultWorld& w) { return EASGetEntryCount(w.fd); },
                   .finish = CloseAll,
                   .clean = {.result = 3}};
    c.rules = {{.call = "setlock", .with = "(0)", .outcome = {.result = -1, .records = {kLock}}},
               // The count is known; of the lock, the record tells.
               {.call = "setlock", .outcome = {.result = 3, .records = {kLock}}},
               HalfIsEnough(2960, 3)};
    c.rules = c.rules + Reading(3);
    SweepFaults(c);
}

// ---- The table ----

// Promise: "MAVOEASAllocEntry: 0x200"
TEST(StreamTableFaults, ATableThatCannotGrowStaysValid) {
    FaultCase c = OnHandle("make room for attributes", ThreeAttributes(0).Build(),
                           [](FaultWorld& w) { return MAVOEASAllocEntry(w.handle, 10); });
    c.state = [](FaultWorld& w) {
        return HandleText(w) + " of " + std::to_string(w.handle->capacity);
    };
    c.rules = {Refused("malloc", kTableMemory)};
    SweepFaults(c);
}

TEST(StreamTableFaults, AListThatCannotTakeANameIsEmptied) {
    FaultCase c = OnHandle("list attributes", ThreeAttributes(0).Build(),
                           [](FaultWorld& w) { return MAVOEASEnum(w.handle, &w.list); });
    c.prepare = [](FaultWorld& w) {
        OpenStream(w, ThreeAttributes(0).Build());
        w.list = NewList({"before"});
    };
    c.check = [](FaultWorld& w, const FaultRun& run) {
        std::vector<std::string> names = {"before", "first", "second", "third"};
        if (!run.call.empty()) names.clear();
        EXPECT_EQ(names, Strings(w.list));
    };
    c.clean = {.result = 3};
    c.rules = {{.call = "MLIBCSzListPush", .outcome = {.result = -1}}};
    SweepFaults(c);
}

TEST(StreamTableFaults, AHeaderIsWrittenOrTheShortWriteIsRecorded) {
    FaultCase c = OnHandle("write a header", ThreeAttributes(0).Build(),
                           [](FaultWorld& w) { return MAVOEASWriteHeader(w.handle); });
    c.prepare = [](FaultWorld& w) {
        OpenStream(w, ThreeAttributes(0).Build());
        w.handle->header[kFinderInfoAt] = 0x46;
    };
    const ExpectedRecord write = {0xB00, "eas_write_header"};
    c.rules = {
        Refused("malloc", {0x200, "eas_write_header"}),
        TakenUpAgain("pwrite", 0),
        {.call = "pwrite", .outcome = {.result = -1, .records = {write}, .torn = {kFile}}},
        {.call = "lseek",
         .outcome = {
             .result = -1, .records = {{0xA00, "eas_write_header"}}, .files = Files::kDone}}};
    SweepFaults(c);
}

TEST(StreamTableFaults, AnEntryMovesOnlyWhenItsValuesCouldBeRead) {
    for (int remove : {0, 1}) {
        FaultCase c =
            OnHandle(remove != 0 ? "drop an entry" : "move an entry", ThreeAttributes(1000).Build(),
                     [remove](FaultWorld& w) {
                         w.buffer.resize(1000);
                         return MAVOEASUpdateEntry(w.handle, 1, w.buffer.data(), 1000, remove);
                     });
        c.rules = {Refused("lseek", {0xA00, "eas_update_entry"}), TakenUpAgain("preadv", 0),
                   Refused("preadv", {0xA00, "eas_update_entry"})};
        SweepFaults(c);
    }
}

// ---- Values ----

TEST(StreamReadFaults, AValueIsReadWholeOrNotAtAll) {
    FaultCase c = OnHandle("read a value", ThreeAttributes(0).Build(), [](FaultWorld& w) {
        w.buffer.assign(800, 0);
        return MAVOEASRead(w.handle, "second", w.buffer.data(), 800, 100);
    });
    c.clean = {.result = 600};
    c.check = [](FaultWorld& w, const FaultRun& run) {
        const Bytes value = Pattern(700, 2);
        if (run.result == 600) {
            EXPECT_TRUE(std::equal(value.begin() + 100, value.end(), w.buffer.begin()));
        }
    };
    c.rules = {TakenUpAgain("pread", 600), Refused("pread", {0xA00, "eas_read"})};
    SweepFaults(c);
}

// A rewrite's sync: all is on its way to the disk by then, but it is not known to have arrived.
FaultRule NotSynced(std::vector<ExpectedRecord> records) {
    return {.call = "fsync",
            .outcome = {.result = -1, .records = std::move(records), .files = Files::kDone}};
}

// Whatever stops a rewrite on its way leaves the file torn, the handle as it would have been.
Outcome Torn(std::vector<ExpectedRecord> records) {
    return {.result = -1, .records = std::move(records), .files = Files::kDone, .torn = {kFile}};
}

// Of the write of header, table and values.
Rules Rewriting(const char* unit, long long result) {
    const Outcome head_torn = Torn({{0xB00, "eas_write_header"}});
    return {
        TakenUpAgain("pwrite", result),
        // Half of it is more than header and table, one byte is less.
        {.call = "pwrite", .errors = {kShortThenNone}, .bytes = 1, .outcome = head_torn},
        {.call = "pwrite", .errors = {kShortThenNone}, .outcome = Torn({{0xB00, unit}})},
        {.call = "pwrite", .outcome = head_torn},
    };
}

constexpr char kReadLine[] =
    "eas_move_rfork:LINE(EASMoveRFork) failed to read, cRead=-1, cToRead=16384, reason={error}.";
constexpr char kReadLastLine[] =
    "eas_move_rfork:LINE(EASMoveRFork) failed to read, cRead=-1, cToRead=7232, reason={error}.";
constexpr char kWriteLine[] = "eas_move_rfork:LINE(EASMoveRFork) failed to write, reason={error}.";
constexpr char kWroteNothingLine[] =
    "eas_move_rfork:LINE(EASMoveRFork) failed to write, reason=Input/output error.";

// A fork of 40,000 bytes, moved in three steps, by reads and writes of 16,384 and 7,232 bytes.
Rules MovingTheFork(long long result) {
    Rules rules;
    for (const char* size : {"(16384,", "(7232,"}) {
        const bool last = size[1] == '7';
        Outcome read_fails = Torn({});
        read_fails.log = {last ? kReadLastLine : kReadLine};
        Outcome write_fails = Torn({});
        write_fails.log = {kWriteLine};
        Outcome nothing_written = Torn({});
        nothing_written.log = {kWroteNothingLine};
        rules =
            rules +
            Rules{{.call = "pread",
                   .with = size,
                   .errors = {EINTR, kShortOnce},
                   .outcome = {.result = result, .files = Files::kDone}},
                  {.call = "pread", .with = size, .errors = {EIO}, .outcome = read_fails},
                  // The file ends here: so does the fork.
                  {.call = "pread",
                   .with = size,
                   .errors = {kShort},
                   .outcome = {.result = result, .files = Files::kDone, .torn = {kFile}}},
                  {.call = "pwrite",
                   .with = size,
                   .errors = {EINTR, kShortOnce},
                   .outcome = {.result = result, .files = Files::kDone}},
                  {.call = "pwrite", .with = size, .errors = {EIO, ENOSPC}, .outcome = write_fails},
                  {.call = "pwrite", .with = size, .errors = {kShort}, .outcome = nothing_written}};
    }
    return rules;
}

FaultCase Writing(const char* name, const Bytes& stream, const char* attribute, const Bytes& value,
                  unsigned offset, int flags) {
    FaultCase c = OnHandle(name, stream, [=](FaultWorld& w) {
        return MAVOEASWrite(w.handle, attribute, value.data(), static_cast<unsigned>(value.size()),
                            offset, flags);
    });
    c.clean = {.result = static_cast<long long>(value.size())};
    return c;
}

// Promise: "MAVOEASWrite: 0x200"
TEST(StreamWriteFaults, TheFirstAttributeIsWrittenOrTheFailureRecorded) {
    FaultCase c = Writing("write a first attribute", {}, "a", Pattern(300), 0, 0);
    c.rules = Rules{Refused("malloc", {0x200, "eas_write"}), NotSynced({{0x2A00, "eas_flush"}})} +
              Rewriting("eas_write", 300);
    SweepFaults(c);
}

// Promise: "EA streams: attributes: A failed MAVOEASWrite"
TEST(StreamWriteFaults, ANewAttributeLeavesAllAsItIsUntilTheForkMoves) {
    FaultCase c = Writing("write a new attribute", ThreeAttributes(40'000).Build(), "new",
                          Pattern(300), 4, EAS_WRITE_OVERWRITE);
    const ExpectedRecord read = {0xA00, "eas_write"};
    c.rules = Rules{Refused("malloc", kTableMemory, 3), Refused("malloc", {0x200, "eas_write"}),
                    Refused("lseek", read)} +
              MovingTheFork(300) +
              Rules{TakenUpAgain("pread", 300),
                    Refused("pread", read),
                    // No code: errno tells.
                    {.call = "ftruncate",
                     .outcome = {.result = -1, .error = kInjectedErrno, .torn = {"(state)"}}},
                    NotSynced({{0x2A00, "eas_flush"}})} +
              Rewriting("eas_write", 300);
    SweepFaults(c);
}

TEST(StreamWriteFaults, ATableThatMustGrowGrowsBeforeAnythingElseChanges) {
    StreamImage image;
    for (const char* name : {"1", "2", "3", "4", "5"})
        image.attributes.push_back({name, Pattern(9)});
    FaultCase c = Writing("write a sixth attribute", image.Build(), "6", Pattern(500), 0,
                          EAS_WRITE_OVERWRITE);
    c.prepare = [bytes = image.Build()](FaultWorld& w) {
        OpenStream(w, bytes);
        ASSERT_EQ(5, w.handle->capacity);
    };
    c.rules =
        Rules{
            Refused("malloc", {0x200, "eas_write"}, 1), Refused("malloc", {0x200, "eas_write"}, 2),
            Refused("malloc", kTableMemory, 3),         TakenUpAgain("pread", 500),
            Refused("pread", {0xA00, "eas_write"}),     NotSynced({{0x2A00, "eas_flush"}})} +
        Rewriting("eas_write", 500);
    SweepFaults(c);
}

// Promise: "MAVOEASWrite: 0xA00"
TEST(StreamWriteFaults, AnAttributeThatGrowsLeavesAllAsItIsUntilTheForkMoves) {
    FaultCase c = Writing("write more of an attribute", ThreeAttributes(40'000).Build(), "first",
                          Pattern(300), 4, EAS_WRITE_OVERWRITE);
    c.rules = Rules{Refused("malloc", {0x200, "eas_write"}),
                    Refused("lseek", {0xA00, "eas_write"}),
                    TakenUpAgain("preadv", 300),
                    Refused("preadv", {0xA00, "eas_update_entry"}),
                    {.call = "ftruncate",
                     .outcome = {.result = -1, .error = kInjectedErrno, .torn = {"(state)"}}},
                    NotSynced({{0x2A00, "eas_flush"}})} +
              MovingTheFork(300) + Rewriting("eas_write", 300);
    SweepFaults(c);
}

TEST(StreamWriteFaults, AnAttributeOfTheSameLengthMovesNoFork) {
    FaultCase c = Writing("write an attribute again", ThreeAttributes(40'000).Build(), "second",
                          Pattern(10), 4, EAS_WRITE_OVERWRITE);
    c.rules = Rules{Refused("malloc", {0x200, "eas_write"}), Refused("lseek", {0xA00, "eas_write"}),
                    TakenUpAgain("preadv", 10), Refused("preadv", {0xA00, "eas_update_entry"}),
                    NotSynced({{0x2A00, "eas_flush"}})} +
              Rewriting("eas_write", 10);
    SweepFaults(c);
}

TEST(StreamWriteFaults, InALargeStreamTheLastValueIsWrittenAndTheOthersAreLeft) {
    StreamImage image = ThreeAttributes(0);
    image.attributes[2].value = Pattern(70'000, 4);
    FaultCase c = Writing("write over the last value of a large stream", image.Build(), "third",
                          Pattern(10), 4, EAS_WRITE_OVERWRITE);
    const Outcome value_torn = Torn({{0xB00, "eas_write"}});
    c.rules = Rules{Refused("malloc", {0x200, "eas_write"}, 1),
                    Refused("lseek", {0xA00, "eas_write"}),
                    // Header and table are written when they cannot be compared.
                    {.call = "malloc", .outcome = {.result = 10, .files = Files::kDone}},
                    {.call = "pread", .outcome = {.result = 10, .files = Files::kDone}},
                    TakenUpAgain("pwrite", 10),
                    {.call = "pwrite", .outcome = value_torn},
                    NotSynced({{0x2A00, "eas_flush"}})};
    SweepFaults(c);
}

TEST(StreamWriteFaults, InALargeStreamOnlyWhatLiesBehindAValueMoves) {
    StreamImage image = ThreeAttributes(0);
    image.attributes[2].value = Pattern(70'000, 4);
    FaultCase c = Writing("write over another value of a large stream", image.Build(), "second",
                          Pattern(10), 4, EAS_WRITE_OVERWRITE);
    c.rules =
        Rules{Refused("malloc", {0x200, "eas_write"}, 1),
              Refused("lseek", {0xA00, "eas_write"}),
              TakenUpAgain("preadv", 10),
              Refused("preadv", {0xA00, "eas_update_entry"}),
              {.call = "malloc", .outcome = {.result = 10, .files = Files::kDone}},
              {.call = "pread", .outcome = {.result = 10, .files = Files::kDone}},
              TakenUpAgain("pwrite", 10),
              {.call = "pwrite",
               .with = ", 0)",
               .errors = {kShortThenNone},
               .bytes = 1,
               .outcome = Torn({{0xB00, "eas_write_header"}})},
              {.call = "pwrite", .with = ", 0)", .outcome = Torn({{0xB00, "eas_write_header"}})},
              {.call = "pwrite", .outcome = Torn({{0xB00, "eas_write"}})},
              NotSynced({{0x2A00, "eas_flush"}})};
    SweepFaults(c);
}

// Promise: "MAVOEASRemove: 0x200"
// Promise: "MAVOEASRemove: 0xA00"
// Promise: "MAVOEASRemove: A failure to move"
// Promise: "MAVOEASRemove: the log has its cause"
TEST(StreamRemoveFaults, AnAttributeIsRemovedOrTheFailureRecorded) {
    StreamImage image = ThreeAttributes(40'000);
    image.attributes[2].value = Pattern(300, 4);  // what stays outweighs header and table
    FaultCase c = OnHandle("remove an attribute", image.Build(),
                           [](FaultWorld& w) { return MAVOEASRemove(w.handle, "second"); });
    c.rules = Rules{Refused("malloc", {0x200, "eas_remove"}),
                    Refused("lseek", {0xA00, "eas_remove"}),
                    TakenUpAgain("preadv", 0),
                    Refused("preadv", {0xA00, "eas_update_entry"}),
                    // The file stays longer, that is all.
                    {.call = "ftruncate", .outcome = {.files = Files::kDone, .torn = {kFile}}},
                    NotSynced({{0x2A00, "eas_flush"}})} +
              MovingTheFork(0) + Rewriting("eas_remove", 0);
    c.check = [image](FaultWorld& w, const FaultRun& run) {
        if (!run.call.starts_with("ftruncate(")) return;
        StreamImage left = image;
        left.attributes.erase(left.attributes.begin() + 1);
        Bytes file = ReadFile(w / kFile);
        EXPECT_EQ(image.End(), file.size());
        file.resize(left.End());
        EXPECT_EQ(left.Build(), file);
    };
    SweepFaults(c);
}

// Promise: "MAVOEASTruncate: 0x200"
// Promise: "MAVOEASTruncate: 0xA00"
TEST(StreamTruncateFaults, ATruncatedValueIsWrittenOrTheFailureRecorded) {
    struct Length {
        const char* name;
        unsigned length;
    };
    for (const Length& to : {Length{"shorten a value", 350}, {"lengthen a value", 900}}) {
        FaultCase c = OnHandle(to.name, ThreeAttributes(0).Build(), [to](FaultWorld& w) {
            return MAVOEASTruncate(w.handle, "second", to.length);
        });
        c.rules = Rules{Refused("malloc", {0x200, "eas_truncate"}), TakenUpAgain("preadv", 0),
                        Refused("preadv", {0xA00, "eas_update_entry"}),
                        // Recorded a second time.
                        NotSynced({{0x2A00, "eas_flush"}, {0x2A00, "eas_truncate"}})} +
                  Rewriting("eas_truncate", 0);
        SweepFaults(c);
    }
}

// ---- AppleDouble files ----

TEST(CheckFaults, WhatCannotBeReadIsNoAppleDoubleFile) {
    FaultCase c = {.name = "check a ._ file",
                   .prepare =
                       [](FaultWorld& w) {
                           WriteFile(w / "a", Ascii("data"));
                           WriteFile(w / "._a", PlainAppleDouble(Repeat(0x46, 32), Pattern(100)));
                       },
                   .run = [](FaultWorld& w) { return MAVOEACheckADFile((w / "._a").c_str()); }};
    c.rules = {{.call = "open", .outcome = {.result = -3}},
               TakenUpAgain("pread", 0),
               {.call = "pread", .outcome = {.result = -3}},
               {.call = "lstat", .outcome = {.result = -4}}};
    SweepFaults(c);
}

TEST(CheckFaults, ALongPathNeedsMemory) {
    FaultCase c = {.name = "check a ._ file, long path",
                   .run =
                       [](FaultWorld&) {
                           std::string path(4200, '/');
                           return MAVOEACheckADFile((path + "dev/null/._a").c_str());
                       },
                   .clean = {.result = -3}};
    c.rules = {Refused("malloc", {0x200, "ea_check_ad_file"}),
               {.call = "open", .outcome = {.result = -3}}};
    SweepFaults(c);
}

constexpr char kTo[] = "to";

FaultCase Importing(const char* name, const StreamImage& from, const StreamImage& to) {
    return {.name = name,
            .prepare =
                [from = from.Build(), to = to.Build()](FaultWorld& w) {
                    OpenFile(w, from);
                    WriteFile(w / kTo, to);
                    w.other_fd = ::open((w / kTo).c_str(), O_RDWR | O_CLOEXEC);
                },
            .run = [](FaultWorld& w) { return EASWriteToFd(w.fd, w.other_fd); },
            .finish = CloseAll,
            .check =
                [](FaultWorld& w, const FaultRun& run) {
                    // The release itself may have failed.
                    if (run.expected == nullptr || run.call.starts_with("setlock(2)")) return;
                    EXPECT_FALSE(HoldsLock(w / kFile));
                    EXPECT_FALSE(HoldsLock(w / kTo));
                }};
}

// How many of `attributes` the stream at `path` does not hold as they are; -1 when it cannot be
// opened.
int Missing(const std::string& path, const std::vector<Attribute>& attributes) {
    const int fd = ::open(path.c_str(), O_RDWR | O_CLOEXEC);
    EASHandle* const stream = MAVOEASOpen(fd, F_RDLCK);
    int missing = stream == nullptr ? -1 : 0;
    for (const Attribute& attribute : attributes) {
        if (stream == nullptr) break;
        Bytes value(attribute.value.size() + 1);
        const int size = MAVOEASRead(stream, attribute.name.c_str(), value.data(),
                                     static_cast<unsigned>(value.size()), 0);
        value.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
        if (value != attribute.value) ++missing;
    }
    if (stream != nullptr) MAVOEASClose(stream);
    ::close(fd);
    return missing;
}

const StreamImage kImported = {.attributes = {{"small", Pattern(40, 1)},
                                              {"large", Pattern(2000, 2)},
                                              {"larger", Pattern(3000, 3)}}};
// `lost` attributes of those of kImported.
Outcome Lost(int lost, std::vector<ExpectedRecord> records) {
    return {.result = -1 - lost, .records = std::move(records), .torn = {kTo}};
}

TEST(ImportFaults, EachAttributeThatFailsIsCountedAndTheOthersAreCopied) {
    const StreamImage to = {.attributes = {{"kept", Pattern(50, 4)}}};
    FaultCase c = Importing("import three attributes", kImported, to);
    c.check = [to, check = c.check](FaultWorld& w, const FaultRun& run) {
        check(w, run);
        if (run.expected == nullptr) return;
        // A rewrite that stops half-way through leaves the header of one stream before the values
        // of another. In all other cases nothing is lost but what is counted.
        if (run.call.starts_with("pwrite(") && run.error == kShortThenNone) return;
        EXPECT_EQ(0, Missing(w / kTo, to.attributes));
        if (run.result > -2) return;
        // What was written and not synced counts as lost, and is there for now.
        const int lost = run.call.starts_with("fsync(") ? 0 : static_cast<int>(-1 - run.result);
        EXPECT_EQ(lost, Missing(w / kTo, kImported.attributes));
    };
    const ExpectedRecord no_memory = {0x100, "eas_write_to_fd"};
    const ExpectedRecord not_read = {0xA00, "eas_write_to_fd"};
    const ExpectedRecord not_written = {0xB00, "eas_write_to_fd"};
    const ExpectedRecord write_memory = {0x200, "eas_write"};
    const ExpectedRecord write_read = {0xA00, "eas_write"};
    const ExpectedRecord write_write = {0xB00, "eas_write"};
    const ExpectedRecord head_write = {0xB00, "eas_write_header"};
    const ExpectedRecord flush = {0x2A00, "eas_flush"};
    const auto synced_but = [&](int fsyncs_after) {
        return Outcome{.result = -2,
                       .records = {flush, not_written},
                       .files = Files::kDone,
                       .fsyncs_after = fsyncs_after};
    };
    const std::vector<int> once = {EIO, kNoneOnce};
    c.rules = {
        // The first calls of each kind open the two streams.
        Refused("malloc", kOpenMemory, 1),
        Refused("malloc", kTableMemory, 2),
        Refused("malloc", kOpenMemory, 3),
        Refused("malloc", kOpenMemory, 4),
        Refused("malloc", kOpenMemory, 5),
        Refused("malloc", kOpenMemory, 6),
        Refused("malloc", kTableMemory, 7),
        Refused("malloc", kOpenMemory, 8),
        // The buffer of 1024 bytes: the first value finds a smaller one.
        {.call = "malloc", .ordinal = 9, .outcome = {.files = Files::kDone}},
        {.call = "malloc", .with = "(2000)", .outcome = Lost(1, {no_memory})},
        {.call = "malloc", .with = "(3000)", .outcome = Lost(1, {no_memory})},
        {.call = "malloc", .ordinal = 12, .outcome = Lost(1, {kTableMemory, not_written})},
        {.call = "malloc", .outcome = Lost(1, {write_memory, not_written})},
        // The releases of both locks at the end; the descriptors are closed next.
        {.call = "setlock", .with = "(2)", .outcome = {.records = {kLock}, .files = Files::kDone}},
        Refused("setlock", kLock),
        {.call = "lseek", .outcome = Lost(3, {not_read, not_read, not_read})},
        TakenUpAgain("pread", 0),
        // Half of the source holds header and table, and no values that can be read.
        {.call = "pread",
         .with = "(8192, 0)",
         .errors = {kShortThenNone},
         .bytes = 2610,
         .outcome = {.result = -1, .records = {kOpenRead}}},
        // The streams are opened all the same.
        {.call = "pread", .with = ", 0)", .errors = once, .outcome = {.files = Files::kDone}},
        Refused("pread", kOpenRead, 1),
        Refused("pread", kOpenRead, 2),
        // The values of the source: one read fails, or it and all later ones.
        {.call = "pread", .with = "(40,", .errors = once, .outcome = Lost(1, {not_read})},
        {.call = "pread", .with = "(40,", .outcome = Lost(3, {not_read, not_read, not_read})},
        {.call = "pread", .with = "(2000,", .errors = once, .outcome = Lost(1, {not_read})},
        {.call = "pread", .with = "(2000,", .outcome = Lost(2, {not_read, not_read})},
        {.call = "pread", .with = "(3000,", .outcome = Lost(1, {not_read})},
        // Those of the destination, which is about to be rewritten.
        {.call = "pread",
         .with = "(50,",
         .errors = once,
         .outcome = Lost(1, {write_read, not_written})},
        {.call = "pread",
         .with = "(50,",
         .outcome = Lost(3, {write_read, not_written, not_read, not_read})},
        {.call = "pread",
         .with = "(90,",
         .errors = once,
         .outcome = Lost(1, {write_read, not_written})},
        {.call = "pread", .with = "(90,", .outcome = Lost(2, {write_read, not_written, not_read})},
        {.call = "pread", .with = "(2090,", .outcome = Lost(1, {write_read, not_written})},
        // A stream that could not be rewritten is opened anew for the next attribute.
        TakenUpAgain("pwrite", 0),
        {.call = "pwrite",
         .with = "(246,",
         .errors = {EIO, ENOSPC, kNoneOnce},
         .outcome = Lost(1, {head_write, not_written})},
        {.call = "pwrite",
         .with = "(246,",
         .errors = {kShortThenNone},
         .bytes = 1,
         .outcome =
             Lost(3, {head_write, not_written, head_write, not_written, head_write, not_written})},
        {.call = "pwrite",
         .with = "(246,",
         .errors = {kNone},
         .outcome =
             Lost(3, {head_write, not_written, head_write, not_written, head_write, not_written})},
        {.call = "pwrite",
         .with = "(246,",
         .errors = {kShortThenNone},
         .outcome =
             Lost(3, {head_write, not_written, {0xA00, "eas_open"}, not_written, not_written})},
        {.call = "pwrite",
         .with = "(2266,",
         .errors = {EIO, ENOSPC, kNoneOnce},
         .outcome = Lost(1, {head_write, not_written})},
        {.call = "pwrite",
         .with = "(2266,",
         .errors = {kNone},
         .outcome = Lost(2, {head_write, not_written, head_write, not_written})},
        {.call = "pwrite",
         .with = "(2266,",
         .errors = {kShortThenNone},
         .bytes = 1,
         .outcome = Lost(2, {head_write, not_written, head_write, not_written})},
        // Half a header refuses to be opened, or to be rewritten.
        {.call = "pwrite",
         .with = "(2266,",
         .errors = {kShortThenNone},
         .bytes = 1133,
         .outcome = Lost(2, {write_write, not_written, write_read, not_written})},
        {.call = "pwrite",
         .with = "(5286,",
         .errors = {kShortThenNone},
         .bytes = 2643,
         .outcome = Lost(1, {write_write, not_written})},
        {.call = "pwrite", .with = "(5286,", .outcome = Lost(1, {head_write, not_written})},
        // Each attribute has a sync of its own; the failed one is not made again.
        {.call = "fsync", .ordinal = 1, .outcome = synced_but(2)},
        {.call = "fsync", .ordinal = 2, .outcome = synced_but(1)},
        {.call = "fsync", .ordinal = 3, .outcome = synced_but(0)},
    };
    SweepFaults(c);
}

TEST(ImportFaults, AWriteThatFailsLeavesWhatWasThereBeforeToBeRead) {
    // A fork behind the attributes: bytes that a write after the failed one could take for values.
    const StreamImage to = {.attributes = {{"kept", Pattern(50, 4)}}, .fork = Pattern(40'000, 5)};
    ResetKernel();
    ResetPlatform();
    const TempDir dir;
    WriteFile(dir / kFile, kImported.Build());
    WriteFile(dir / kTo, to.Build());
    const int from_fd = ::open((dir / kFile).c_str(), O_RDONLY | O_CLOEXEC);
    const int to_fd = ::open((dir / kTo).c_str(), O_RDWR | O_CLOEXEC);
    {
        FailCall fault("pwrite", EIO, 4);  // The fork has moved in three; this one is the header.
        EXPECT_GT(-1, EASWriteToFd(from_fd, to_fd));
        EXPECT_TRUE(fault.fired());
    }
    ::close(from_fd);
    ::close(to_fd);
    EXPECT_EQ(0, Missing(dir / kTo, to.attributes));
    ResetKernel();
    ResetPlatform();
}

// ---- Repair ----

constexpr char kResource[] = "@eaDir/a@MavoResource";
constexpr char kTemporary[] = "@eaDir/a@MavoResourceTmp";
constexpr char kStream[] = "@eaDir/a@MavoEAStream";

FaultCase Repairing(const char* name, const Bytes& resource) {
    return {.name = name,
            .prepare =
                [resource](FaultWorld& w) {
                    WriteFile(w / "a", Ascii("data"));
                    ASSERT_EQ(0, ::mkdir((w / "@eaDir").c_str(), 0755));
                    WriteFile(w / kResource, resource);
                },
            .run = [](FaultWorld& w) { return MAVOEAFixErrorAD((w / "a").c_str()); }};
}

// A repair that failed has left the resource file as it was and no temporary one, whatever has been
// reported on the way; the stream may have taken attributes.
Outcome NotRepaired(Names made = {}) {
    return {.result = -1, .made = std::move(made), .any_log = true, .any_records = true};
}

const Outcome kRepaired = {.files = Files::kDone};

// While the resource file is converted: `entries` and `finder_info` are the reads of those, `made`
// is what there is before the converted file takes its place.
Rules Converting(const char* entries, const char* finder_info, const Names& made) {
    Outcome defaults = kRepaired;
    defaults.torn = {kResource};
    defaults.log = {"ea_copy.c:LINE(EAGetEntriesBuf) failed to read, reason={error}."};
    Outcome at_end = defaults;
    at_end.log = {"ea_copy.c:LINE(EAGetEntriesBuf) failed to read, reason=Success."};
    Outcome cut_off = kRepaired;
    cut_off.torn = {kResource};
    // Moved over nothing, since nothing was converted: the resource file stays.
    const Outcome nothing_there = {.files = Files::kEach};
    return {
        {.call = "lstat", .with = "@MavoResource)", .outcome = NotRepaired()},
        {.call = "open",
         .with = "@MavoResource,",
         .ordinal = 1,
         .errors = {ENOENT},
         .outcome = nothing_there},
        {.call = "open",
         .with = "@MavoResource,",
         .ordinal = 2,
         .errors = {ENOENT},
         .outcome = nothing_there},
        {.call = "open", .with = "@MavoResource,", .outcome = NotRepaired()},
        {.call = "open", .with = "@MavoResourceTmp,", .outcome = NotRepaired()},
        // What cannot be locked is another's; what does not seem to be there is made again.
        {.call = "setlock", .with = "(1)", .ordinal = 1, .outcome = NotRepaired({kTemporary})},
        {.call = "lstat", .with = kTemporary, .ordinal = 1, .outcome = kRepaired},
        // It is looked at before it is renamed, and behind that.
        {.call = "lstat", .with = kTemporary, .ordinal = 2, .outcome = NotRepaired(made)},
        {.call = "lstat", .with = kTemporary, .outcome = kRepaired},
        {.call = "fstat", .ordinal = 3, .outcome = NotRepaired(made)},
        {.call = "fstat", .outcome = kRepaired},
        {.call = "fchmod", .outcome = NotRepaired()},
        // The conversion is not moved into place, and nobody is told.
        {.call = "rename", .with = kTemporary, .outcome = nothing_there},

        TakenUpAgain("pread", 0),
        // Whether the fork is a blank one; a fork that cannot be looked at is not.
        {.call = "pread", .with = "(46,", .errors = {EIO, kNoneOnce}, .outcome = kRepaired},
        // The entries once more: what cannot be read is taken to be where it usually is.
        {.call = "pread", .with = "(26, 0)", .ordinal = 3, .errors = {EIO}, .outcome = defaults},
        {.call = "pread", .with = entries, .ordinal = 2, .errors = {EIO}, .outcome = defaults},
        {.call = "pread",
         .with = "(26, 0)",
         .ordinal = 3,
         .errors = {kNoneOnce},
         .outcome = at_end},
        {.call = "pread", .with = entries, .ordinal = 2, .errors = {kNoneOnce}, .outcome = at_end},
        // A file that ends here has no more.
        {.call = "pread", .with = finder_info, .errors = {kNoneOnce}, .outcome = cut_off},
    };
}

void ExpectResourceKeptUnlessRepaired(FaultWorld& w, const FaultRun& run, const Bytes& resource) {
    if (run.expected == nullptr || (run.result == 0 && !run.call.starts_with("rename("))) return;
    EXPECT_EQ(resource, ReadFile(w / kResource));
}

TEST(RepairFaults, AResourceFileWithoutAttributesIsConvertedOrStaysAsItIs) {
    // Several reads of entries and fork, and entries elsewhere than in the converted file.
    const Bytes resource = PlainAppleDouble(Repeat(0x46, 32), Pattern(20'000), 13);
    FaultCase c = Repairing("repair, no attributes", resource);
    c.check = [resource](FaultWorld& w, const FaultRun& run) {
        ExpectResourceKeptUnlessRepaired(w, run, resource);
    };
    Outcome cut_off = kRepaired;
    cut_off.torn = {kResource};
    Outcome not_released = kRepaired;
    not_released.records = {kLock};
    c.rules = Converting("(156, 26)", "(32, 182)", {}) +
              Rules{
                  {.call = "pread",
                   .with = "(8192, 0)",
                   .errors = {kShortThenNone},
                   .bytes = 4096,  // more than the header, which is all that is looked at
                   .outcome = kRepaired},
                  {.call = "pread",
                   .with = "(8192, 0)",
                   .errors = {EIO, kNoneOnce},
                   .outcome = kRepaired},
                  {.call = "pread", .with = "(16384,", .errors = {kNoneOnce}, .outcome = cut_off},
                  {.call = "pread", .with = "(3616,", .errors = {kNoneOnce}, .outcome = cut_off},
                  {.call = "pread", .outcome = NotRepaired()},
                  TakenUpAgain("pwrite", 0),
                  {.call = "pwrite", .outcome = NotRepaired()},
                  {.call = "lseek", .outcome = NotRepaired()},
                  {.call = "setlock", .with = "(2)", .outcome = not_released},
                  {.call = "setlock", .outcome = NotRepaired()},
                  {.call = "fsync", .outcome = NotRepaired()},
              };
    SweepFaults(c);
}

TEST(RepairFaults, AResourceFileWithAttributesIsConvertedOrStaysAsItIs) {
    const Bytes resource = ThreeAttributes(3000).Build();
    FaultCase c = Repairing("repair, three attributes", resource);
    c.check = [resource](FaultWorld& w, const FaultRun& run) {
        ExpectResourceKeptUnlessRepaired(w, run, resource);
    };
    Outcome cut_off = kRepaired;
    cut_off.torn = {kResource};
    Outcome not_released = kRepaired;
    not_released.records = {kLock};
    Outcome not_synced = NotRepaired({kStream});
    const auto syncs_after = [&](int count) {
        not_synced.fsyncs_after = count;
        return not_synced;
    };
    c.rules =
        Converting("(24, 26)", "(32, 50)", {kStream}) +
        Rules{
            {.call = "pread", .with = "(3000,", .errors = {kNoneOnce}, .outcome = cut_off},
            // Header, table and not all values.
            {.call = "pread",
             .with = "(8192, 0)",
             .errors = {kShortThenNone},
             .outcome = {.result = -1, .free = {kStream}, .any_records = true}},
            {.call = "pread",
             .with = "(8192, 0)",
             .errors = {EIO, kNoneOnce},
             .outcome = kRepaired},
            // Behind these reads the stream is there.
            {.call = "pread", .with = "(8192, 0)", .ordinal = 1, .outcome = NotRepaired()},
            {.call = "pread", .with = "(8192, 0)", .outcome = NotRepaired({kStream})},
            {.call = "pread", .with = "(40,", .outcome = NotRepaired({kStream})},
            {.call = "pread", .with = "(700,", .outcome = NotRepaired({kStream})},
            {.call = "pread", .with = "(740,", .outcome = NotRepaired({kStream})},
            {.call = "pread", .outcome = NotRepaired()},
            TakenUpAgain("pwrite", 0),
            {.call = "pwrite", .with = "(180, 0)", .outcome = NotRepaired({kStream})},
            {.call = "pwrite", .with = "(900, 0)", .outcome = NotRepaired({kStream})},
            {.call = "pwrite", .with = "(920, 0)", .outcome = NotRepaired({kStream})},
            {.call = "pwrite", .outcome = NotRepaired()},
            {.call = "lseek", .ordinal = 1, .outcome = NotRepaired()},
            {.call = "lseek", .ordinal = 2, .outcome = NotRepaired()},
            {.call = "lseek", .outcome = NotRepaired({kStream})},
            {.call = "setlock", .with = "(2)", .outcome = not_released},
            {.call = "setlock", .with = "(0)", .ordinal = 1, .outcome = NotRepaired()},
            {.call = "setlock", .outcome = NotRepaired({kStream})},
            // The stream's directory is there, and its file is looked for in older layouts.
            {.call = "mkdir", .errors = {EEXIST}, .outcome = kRepaired},
            {.call = "mkdir", .outcome = NotRepaired()},
            {.call = "open", .with = "@MavoEAStream, O_RDWR|O_CREAT", .outcome = NotRepaired()},
            {.call = "open", .with = "@MavoEAStream,", .errors = {ENOENT}, .outcome = kRepaired},
            {.call = "open", .with = "@MavoEAStream,", .outcome = NotRepaired()},
            {.call = "opendir", .errors = {ENOENT}, .outcome = kRepaired},
            {.call = "opendir", .outcome = NotRepaired()},
            {.call = "lstat", .errors = {ENOENT}, .outcome = kRepaired},
            {.call = "lstat", .outcome = NotRepaired()},
            {.call = "malloc", .ordinal = 1, .outcome = NotRepaired()},
            {.call = "malloc", .with = "(1024)", .outcome = kRepaired},
            {.call = "malloc", .outcome = NotRepaired({kStream})},
            {.call = "fsync", .ordinal = 1, .outcome = syncs_after(2)},
            {.call = "fsync", .ordinal = 2, .outcome = syncs_after(1)},
            {.call = "fsync", .outcome = syncs_after(0)},
        };
    SweepFaults(c);
}

}  // namespace
}  // namespace mavoea::test

// Damaged EA streams and calls that fail: whatever is on disk and whatever fails, an operation ends
// in success or in a recorded code, and a refused one has changed nothing.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_fixture.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

Bytes Slice(const Bytes& bytes, std::size_t from, std::size_t size) {
    from = std::min(from, bytes.size());
    size = std::min(size, bytes.size() - from);
    const auto begin = bytes.begin() + static_cast<std::ptrdiff_t>(from);
    return Bytes(begin, begin + static_cast<std::ptrdiff_t>(size));
}

class EasDamageTest : public StreamTest {
 protected:
    // The kinds of streams that are damaged.
    static std::map<std::string, Bytes> Kinds() {
        std::map<std::string, Bytes> kinds;
        const Bytes finder_info = Hex("'TEXTttxt' 00*24");
        StreamImage image{
            .attributes = {{"a", Ascii("xyz")}, {"empty", {}}, {"user.comment", Pattern(40)}},
            .fork = Pattern(60),
            .finder_info = finder_info};
        kinds["stream with fork"] = image.Build();
        image.fork_first = true;
        kinds["stream with fork listed first"] = image.Build();
        image.fork_first = false;
        image.fork.clear();
        kinds["stream without fork"] = image.Build();
        image = {.fork = Pattern(30), .finder_info = finder_info};
        kinds["stream without attributes"] = image.Build();
        image = {.attributes = {{"a", Ascii("xyz")}, {std::string(250, 'n'), Ascii("long")}},
                 .fork = Pattern(30)};
        image.slack = 100;
        kinds["stream with slack and a long name"] = image.Build();
        kinds["plain AppleDouble"] = PlainAppleDouble(finder_info, Pattern(60));
        kinds["plain AppleDouble of five entries"] = PlainAppleDouble(finder_info, Pattern(60), 5);
        return kinds;
    }

    // The memory that an operation on a file may take.
    void CheckMemory(const std::string& what) const {
        EXPECT_LE(TakeAllocations().total, 8 * file_size_ + 65536) << what;
    }

    // What a stream holds that can be read: the last value of each name.
    static std::map<std::string, Bytes> ValuesOf(const Handle& handle) {
        std::map<std::string, Bytes> values;
        Bytes buffer(4096);
        for (const std::string& name : Names(handle)) {
            const int size = MAVOEASRead(handle.get(), name.c_str(), buffer.data(), 4096, 0);
            if (size >= 0) values[name] = Slice(buffer, 0, static_cast<std::size_t>(size));
        }
        return values;
    }

    // Reads all there is to read, with every result accounted for.
    void ReadAll(const Handle& handle) {
        char buffer[256];
        for (const std::string& name : Names(handle)) {
            const int index = MAVOEASSearch(handle.get(), name.c_str());
            ASSERT_GE(index, 0);
            EXPECT_EQ(name, handle->entries[index].name);
            for (const auto& [size, offset] : {std::pair{0u, 0u},
                                               {256u, 0u},
                                               {1u, 2u},
                                               {256u, 0xFFFFFFF0u},
                                               {0u, 0x80000000u}}) {
                const int result = MAVOEASRead(handle.get(), name.c_str(), buffer, size, offset);
                if (result < 0) {
                    EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
                } else if (size != 0) {
                    EXPECT_LE(static_cast<unsigned>(result), size);
                }
            }
        }
        CheckMemory("reading");
        EXPECT_THAT(TakeRecords(), IsEmpty());
    }

    // Runs `change` on a handle of its own on a file of `bytes`. A failure must have one record, of
    // what comes before anything is written, and leave file and memory as they were. A success
    // must have left a stream whose values are those of before but for `changed`.
    void Change(const Bytes& bytes, const std::string& what, const std::string& changed,
                bool moves_fork, const std::function<int(EASHandle*)>& change) {
        SCOPED_TRACE(what);
        Fill(bytes);
        Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        std::map<std::string, Bytes> values = ValuesOf(handle);
        const HandleState before = StateOf(*handle);
        TakeRecords();
        TakeAllocations();

        const int result = change(handle.get());
        CheckMemory(what);
        const std::vector<int> codes = TakeCodes();
        EXPECT_THAT(TakeLog(), IsEmpty());
        if (result < 0) {
            EXPECT_THAT(codes, ElementsAre(AnyOf(0xA00, 0xD00, 0x2000)));
            EXPECT_EQ(bytes, Contents());
            EXPECT_TRUE(before == StateOf(*handle));
            return;
        }
        EXPECT_THAT(codes, IsEmpty());
        EXPECT_LE(FileSize(), bytes.size() + 2000);
        const HandleState after = StateOf(*handle);
        EXPECT_EQ(Slice(before.header, 50, 32), Slice(after.header, 50, 32));
        EXPECT_EQ(after.header, Contents(120));

        // The invariants of what is written.
        const std::uint32_t data_start = U32At(after.header, kDataStartAt);
        const std::uint32_t total = U32At(after.header, kTotalSizeAt);
        EXPECT_EQ(total, data_start + U32At(after.header, kDataLengthAt));
        EXPECT_EQ(total, U32At(after.header, kForkOffsetAt));
        const std::uint32_t finder_at = U32At(after.header, kFinderOffsetAt);
        EXPECT_EQ(total, finder_at + U32At(after.header, kFinderLengthAt));
        if (U32At(before.header, kFinderIdAt) == 9) {
            EXPECT_EQ(50u, finder_at);
        } else {
            // Only a truncation does without the Finder info's descriptor.
            EXPECT_FALSE(moves_fork);
        }
        std::uint32_t next = data_start;
        for (const auto& entry : after.entries) {
            EXPECT_EQ(next, entry.offset);
            next += entry.length;
        }
        EXPECT_EQ(total, next);

        // A fork that was all there is all there, unless it had none or the operation leaves it.
        if (moves_fork && U32At(before.header, kForkIdAt) == 2) {
            const Bytes fork = Slice(bytes, U32At(before.header, kForkOffsetAt),
                                     U32At(before.header, kForkLengthAt));
            EXPECT_EQ(fork, Contents(fork.size(), total));
        }

        handle = Open();
        const bool others = U16At(before.header, kDescriptorCountAt) != 2;
        if (others && handle == nullptr) return;  // Other bytes count as descriptors now.
        ASSERT_NE(nullptr, handle);
        if (others) return;
        std::map<std::string, Bytes> now = ValuesOf(handle);
        TakeRecords();
        values.erase(changed);
        now.erase(changed);
        EXPECT_EQ(values, now);
    }

    // Opens the stream `bytes` and, when that goes, tries every operation on it.
    void TryAll(const Bytes& bytes) {
        file_size_ = bytes.size();
        Fill(bytes);
        TakeAllocations();
        TakeCalls();
        const int count = EASGetEntryCount(fd_);
        CheckMemory("count");
        if (count < 0) {
            EXPECT_THAT(TakeCodes(), ElementsAre(AnyOf(0xA00, 0xD00)));
        }
        TakeCalls();
        std::vector<std::string> names;
        {
            const Handle handle = Open();
            CheckMemory("open");
            if (handle == nullptr) {
                EXPECT_THAT(TakeCodes(), ElementsAre(AnyOf(0xA00, 0xD00)));
                EXPECT_EQ("setlock(2)", TakeCalls().back());
                EXPECT_EQ(bytes, Contents());
                return;
            }
            EXPECT_GE(count, 0);
            names = Names(handle);
            EXPECT_EQ(static_cast<std::size_t>(std::max(count, 0)), names.size());
            TakeAllocations();
            ReadAll(handle);
            EXPECT_EQ(bytes, Contents());
        }
        Change(bytes, "write new", "new", true, [](EASHandle* handle) {
            return MAVOEASWrite(handle, "new", "12345", 5, 3, EAS_WRITE_OVERWRITE);
        });
        for (const std::string& name : names) {
            if (std::count(names.begin(), names.end(), name) > 1) continue;
            const char* const text = name.c_str();
            if (name.size() < 255) {
                Change(bytes, "overwrite " + name, name, true, [&](EASHandle* handle) {
                    return MAVOEASWrite(handle, text, "12345", 5, 0, EAS_WRITE_OVERWRITE);
                });
            }
            Change(bytes, "remove " + name, name, true,
                   [&](EASHandle* handle) { return MAVOEASRemove(handle, text); });
            Change(bytes, "truncate " + name, name, false,
                   [&](EASHandle* handle) { return MAVOEASTruncate(handle, text, 6); });
        }
        UpdateEntries(bytes, names.size());
    }

    void UpdateEntries(const Bytes& bytes, std::size_t count) {
        Fill(bytes);
        for (unsigned index = 0; index < count; ++index) {
            for (const int remove : {0, 1}) {
                const Handle handle = Open();
                ASSERT_NE(nullptr, handle);
                const HandleState before = StateOf(*handle);
                Bytes buffer(bytes.size());
                if (MAVOEASUpdateEntry(handle.get(), index, buffer.data(),
                                       static_cast<unsigned>(buffer.size()), remove) != 0) {
                    EXPECT_THAT(TakeCodes(), ElementsAre(AnyOf(0xA00, 0x100)));
                    EXPECT_TRUE(before == StateOf(*handle));
                }
                EXPECT_EQ(bytes, Contents());
            }
        }
        EXPECT_THAT(TakeRecords(), IsEmpty());
    }

    std::size_t file_size_ = 0;
};

TEST_F(EasDamageTest, EveryTruncationIsHarmless) {
    for (const auto& [kind, bytes] : Kinds()) {
        SCOPED_TRACE(kind);
        for (std::size_t length = 0; length <= bytes.size(); length += kSeriesStep) {
            SCOPED_TRACE(length);
            TryAll(Slice(bytes, 0, length));
            if (HasFailure()) return;
        }
    }
}

TEST_F(EasDamageTest, EveryDamagedByteIsHarmless) {
    for (const auto& [kind, bytes] : Kinds()) {
        SCOPED_TRACE(kind);
        for (std::size_t at = 0; at < bytes.size(); at += kSeriesStep) {
            SCOPED_TRACE(at);
            for (const int value : {0x00, 0x7F, 0x80, 0xFF}) {
                SCOPED_TRACE(value);
                if (bytes[at] == value) continue;
                Bytes damaged = bytes;
                damaged[at] = static_cast<std::uint8_t>(value);
                TryAll(damaged);
                if (HasFailure()) return;
            }
        }
    }
}

TEST_F(EasDamageTest, EveryFieldOffByALittleIsHarmless) {
    const StreamImage image{.attributes = {{"a", Ascii("xyz")}, {"b", {}}, {"c", Pattern(20)}},
                            .fork = Pattern(60)};
    const Bytes bytes = image.Build();
    std::vector<std::size_t> fields = {kFinderOffsetAt, kFinderLengthAt, kForkOffsetAt,
                                       kForkLengthAt,   kTotalSizeAt,    kDataStartAt,
                                       kDataLengthAt};
    for (std::size_t i = 0; i < 3; ++i) {
        fields.push_back(image.RecordAt(i));
        fields.push_back(image.RecordAt(i) + 4);
    }
    for (const std::size_t field : fields) {
        SCOPED_TRACE(field);
        const std::uint32_t right = U32At(bytes, field);
        for (const std::uint32_t value :
             {right - 16, right - 1, right + 1, right + 3, right + 16, right * 2, 0u - right,
              right + 0x80000000u, 32u, 119u, 120u, 0xFFFFFFF0u}) {
            SCOPED_TRACE(value);
            Bytes damaged = bytes;
            PutU32(damaged, field, value);
            TryAll(damaged);
            if (HasFailure()) return;
        }
    }
}

TEST_F(EasDamageTest, EveryDescriptorAndAttributeCountIsHarmless) {
    const Bytes bytes =
        StreamImage{.attributes = {{"a", Ascii("xyz")}, {"b", Ascii("12")}}, .fork = Pattern(300)}
            .Build();
    for (unsigned count = 0; count < 256; ++count) {
        SCOPED_TRACE(count);
        Bytes damaged = bytes;
        PutU16(damaged, kDescriptorCountAt, count);
        TryAll(damaged);
        damaged = bytes;
        PutU16(damaged, kAttributeCountAt, count);
        TryAll(damaged);
        if (HasFailure()) return;
    }
}

TEST_F(EasDamageTest, ADeclaredCountTakesNoMemoryThatTheFileDoesNotFill) {
    Bytes bytes = StreamImage{.attributes = {{"a", Ascii("xyz")}}}.Build();
    PutU16(bytes, kAttributeCountAt, 0xFFFF);
    Fill(bytes);
    TakeAllocations();
    EXPECT_EQ(nullptr, Open());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_open")));
    EXPECT_LE(TakeAllocations().total, 65536u);
}

TEST_F(EasDamageTest, ADeclaredDataLengthTakesNoMemoryThatTheFileDoesNotFill) {
    for (const std::uint32_t length : {0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu, 0xFFFFFF00u}) {
        SCOPED_TRACE(length);
        const StreamImage image{.attributes = {{"a", Ascii("xyz")}}};
        Bytes bytes = image.Build();
        PutU32(bytes, kDataLengthAt, length);
        PutU32(bytes, image.RecordAt(0) + 4, length);
        Fill(bytes);
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        TakeAllocations();
        EXPECT_EQ(-1, Write(handle, "b", "1"));
        EXPECT_EQ(-1, Write(handle, "a", "1"));
        EXPECT_EQ(-1, MAVOEASRemove(handle.get(), "a"));
        EXPECT_EQ(-1, MAVOEASTruncate(handle.get(), "a", 1));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00, 0xA00, 0xA00, 0xA00));
        EXPECT_LE(TakeAllocations().total, 65536u);
        EXPECT_EQ(bytes, Contents());
    }
}

// Promise: "EA streams: attributes: A stream whose offsets"
// Promise: "EA stream: what does not fit"
TEST_F(EasDamageTest, ValuesThatDoNotFollowEachOtherAreNotRewritten) {
    const StreamImage image{.attributes = {{"a", Ascii("xyz")}, {"b", Ascii("12")}}};
    struct Case {
        std::size_t field;
        std::uint32_t value;
    };
    const std::size_t first = image.RecordAt(0);
    const std::size_t second = image.RecordAt(1);
    const std::uint32_t start = image.DataStart();
    for (const Case& c :
         {Case{first, start + 1}, Case{first, start - 1}, Case{first, 0}, Case{second, start},
          Case{second, start + 4}, Case{second, 0}, Case{first + 4, 2}, Case{first + 4, 4},
          Case{second + 4, 1}, Case{second + 4, 3}, Case{kDataLengthAt, 4}, Case{kDataLengthAt, 6},
          Case{kDataLengthAt, 0}, Case{kDataStartAt, start - 1}, Case{kDataStartAt, start + 1},
          Case{kDataStartAt, 120}}) {
        SCOPED_TRACE(std::to_string(c.field) + " " + std::to_string(c.value));
        Bytes bytes = image.Build();
        PutU32(bytes, c.field, c.value);
        Fill(bytes);
        const Handle handle = Open();
        ASSERT_NE(nullptr, handle);
        const HandleState before = StateOf(*handle);
        EXPECT_EQ(-1, Write(handle, "c", "1"));
        EXPECT_EQ(-1, Write(handle, "b", "1"));
        EXPECT_EQ(-1, MAVOEASRemove(handle.get(), "a"));
        EXPECT_EQ(-1, MAVOEASTruncate(handle.get(), "a", 1));
        Bytes buffer(100);
        EXPECT_EQ(-1, MAVOEASUpdateEntry(handle.get(), 0, buffer.data(), 100, 0));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00, 0xA00, 0xA00, 0xA00, 0xA00));
        EXPECT_EQ(bytes, Contents());
        EXPECT_TRUE(before == StateOf(*handle));
    }
}

// Promise: "EA streams: attributes: A stream whose offsets"
// Promise: "EA stream: what does not fit"
TEST_F(EasDamageTest, ADataAreaBeforeTheEndOfTheTableIsNotRewritten) {
    StreamImage image{.attributes = {{"a", Ascii("xyz")}, {"b", Ascii("12")}}};
    Bytes bytes = image.Build();
    // Coherent in itself, but the values lie over the second record.
    PutU32(bytes, kDataStartAt, 140);
    PutU32(bytes, kFinderLengthAt, 145 - 50);
    PutU32(bytes, kForkOffsetAt, 145);
    PutU32(bytes, image.RecordAt(0), 140);
    PutU32(bytes, image.RecordAt(1), 143);
    Fill(bytes);
    const Handle handle = Open();
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(-1, Write(handle, "c", "1"));
    EXPECT_EQ(-1, MAVOEASRemove(handle.get(), "a"));
    EXPECT_THAT(TakeCodes(), ElementsAre(0xA00, 0xA00));
    EXPECT_EQ(bytes, Contents());
}

// ---- Calls that fail ----------------------------------------------------------------------------

class EasFailingCallsTest : public EasDamageTest {
 protected:
    struct Operation {
        std::string name;
        StreamImage before;
        std::function<int(EASHandle*)> run;
        int result;
        StreamImage after;
        bool from_empty_file = false;
    };

    static std::vector<Operation> Operations() {
        const Attribute a{"a", Ascii("xyz")};
        const Attribute b{"b", Pattern(30)};
        const Bytes fork = Pattern(40000);
        const StreamImage with_fork{.attributes = {a, b}, .fork = fork};
        const StreamImage without{.attributes = {a, b}};
        const Attribute c{"c", Ascii("12345")};
        StreamImage slack = with_fork;
        slack.slack = 2000;
        return {
            {"read", with_fork,
             [](EASHandle* h) {
                 char buffer[10];
                 return MAVOEASRead(h, "b", buffer, 10, 5);
             },
             10, with_fork},
            {"write to an empty file",
             {},
             [](EASHandle* h) { return MAVOEASWrite(h, "c", "12345", 5, 0, 0); },
             5,
             {.attributes = {c}},
             true},
            {"write of an absent name",
             without,
             [](EASHandle* h) { return MAVOEASWrite(h, "c", "12345", 5, 0, 0); },
             5,
             {.attributes = {a, b, c}}},
            {"write of an absent name before a fork",
             with_fork,
             [](EASHandle* h) { return MAVOEASWrite(h, "c", "12345", 5, 0, 0); },
             5,
             {.attributes = {a, b, c}, .fork = fork}},
            {"write of an absent name where the fork moves down",
             slack,
             [](EASHandle* h) { return MAVOEASWrite(h, "c", "12345", 5, 0, 0); },
             5,
             {.attributes = {a, b, c}, .fork = fork}},
            {"overwrite",
             with_fork,
             [](EASHandle* h) { return MAVOEASWrite(h, "a", "XYZ", 3, 0, EAS_WRITE_OVERWRITE); },
             3,
             {.attributes = {b, {"a", Ascii("XYZ")}}, .fork = fork}},
            {"overwrite that grows",
             with_fork,
             [](EASHandle* h) { return MAVOEASWrite(h, "a", "XYZ", 3, 2, EAS_WRITE_OVERWRITE); },
             3,
             {.attributes = {b, {"a", Ascii("xyXYZ")}}, .fork = fork}},
            {"remove",
             without,
             [](EASHandle* h) { return MAVOEASRemove(h, "a"); },
             0,
             {.attributes = {b}}},
            {"remove before a fork",
             with_fork,
             [](EASHandle* h) { return MAVOEASRemove(h, "a"); },
             0,
             {.attributes = {b}, .fork = fork}},
            {"truncate that grows",
             without,
             [](EASHandle* h) { return MAVOEASTruncate(h, "a", 5); },
             0,
             {.attributes = {b, {"a", Hex("'xyz' 00 00")}}}},
            {"truncate that shrinks",
             without,
             [](EASHandle* h) { return MAVOEASTruncate(h, "a", 1); },
             0,
             {.attributes = {b, {"a", Ascii("x")}}}},
        };
    }
};

TEST_F(EasFailingCallsTest, EachIsRecordedOnceAndLeavesNoMemory) {
    for (const Operation& operation : Operations()) {
        SCOPED_TRACE(operation.name);
        const Bytes before = operation.from_empty_file ? Bytes{} : operation.before.Build();
        const bool truncates = operation.name.starts_with("truncate");
        const int live = TakeAllocations().live;
        for (int nth = 1;; ++nth) {
            SCOPED_TRACE(nth);
            Fill(before);
            Handle handle = Open();
            ASSERT_NE(nullptr, handle);
            const HandleState state = StateOf(*handle);
            TakeCalls();
            int result = 0;
            int error = 0;
            std::string failed;
            {
                const FailNthCall fault(nth, EIO);
                result = operation.run(handle.get());
                error = errno;
                failed = fault.name();
            }
            SCOPED_TRACE(failed);
            const std::vector<std::string> calls = TakeCalls();
            const std::vector<std::string> log = TakeLog();
            const std::vector<int> codes = TakeCodes();
            // Nothing but the cut at the end of a removal may fail without failing it, and
            // reserving room where the volume has some.
            const bool ignored = failed == "fallocate" ||
                                 (failed == "ftruncate" && operation.name.starts_with("remove"));
            if (failed.empty() || ignored) {
                EXPECT_EQ(operation.result, result);
                EXPECT_THAT(codes, IsEmpty());
                EXPECT_THAT(log, IsEmpty());
                EXPECT_EQ(operation.after.Build(), Contents(operation.after.End()));
                if (ignored) continue;
                break;
            }
            EXPECT_EQ(-1, result);
            EXPECT_EQ(EIO, error);
            const bool wrote = std::any_of(calls.begin(), calls.end(), [](const std::string& call) {
                return call.starts_with("pwrite") || call.starts_with("ftruncate");
            });
            if (!log.empty()) {
                EXPECT_EQ(1u, log.size());
                EXPECT_THAT(codes, IsEmpty());
                EXPECT_THAT(failed, AnyOf("pread", "pwrite"));
            } else if (failed == "ftruncate") {
                EXPECT_THAT(codes, IsEmpty());
            } else if (failed == "malloc") {
                EXPECT_THAT(codes, ElementsAre(0x200));
                EXPECT_FALSE(wrote);
            } else if (failed == "fsync") {
                if (truncates) {
                    EXPECT_THAT(codes, ElementsAre(0x2A00, 0x2A00));
                } else {
                    EXPECT_THAT(codes, ElementsAre(0x2A00));
                }
            } else if (failed == "pwritev" || failed == "pwrite") {
                EXPECT_THAT(codes, ElementsAre(0xB00));
            } else {
                EXPECT_THAT(codes, ElementsAre(0xA00));
                EXPECT_FALSE(wrote);
            }
            if (!wrote && log.empty()) {
                // Nothing has happened yet: file and memory are as they were, and the operation
                // can be tried again.
                EXPECT_EQ(before, Contents());
                EXPECT_TRUE(state == StateOf(*handle));
                EXPECT_EQ(operation.result, operation.run(handle.get()));
                EXPECT_EQ(operation.after.Build(), Contents(operation.after.End()));
                EXPECT_THAT(TakeCodes(), IsEmpty());
            }
            // The handle keeps its lock until it is closed.
            EXPECT_EQ(F_WRLCK, handle->lockType);
            handle.reset();
            TakeLog();
            EXPECT_EQ(live, TakeAllocations().live);
            EXPECT_EQ("setlock(2)", TakeCalls().back());
        }
    }
}

TEST_F(EasFailingCallsTest, AnyOfThemLeavesAStreamThatOpensWithTheOtherAttributeInIt) {
    for (const Operation& operation : Operations()) {
        if (operation.from_empty_file || operation.before.fork.empty()) continue;
        // Removal moves the fork over the values before their new places are in the header.
        if (operation.name.starts_with("remove")) continue;
        SCOPED_TRACE(operation.name);
        for (int nth = 1;; ++nth) {
            SCOPED_TRACE(nth);
            Fill(operation.before);
            Handle handle = Open();
            ASSERT_NE(nullptr, handle);
            bool fired = false;
            {
                const FailNthCall fault(nth, EIO);
                operation.run(handle.get());
                fired = fault.fired();
            }
            handle = Open();
            ASSERT_NE(nullptr, handle);
            EXPECT_EQ(Pattern(30), Read(handle, "b"));
            if (!fired) break;
        }
        TakeRecords();
    }
}

}  // namespace
}  // namespace mavoea::test

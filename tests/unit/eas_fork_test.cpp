// Moving the resource fork when the data area in front of it changes size.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "include/mavoea.h"
#include "stream/internal.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_fixture.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;

constexpr bool kForwards = false;
constexpr bool kBackwards = true;

class EasForkTest : public StreamTest {
 protected:
    void OpenWith(const StreamImage& image) {
        handle_.reset();
        image_ = image;
        Fill(image_);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        TakeCalls();
    }
    EASHandle* h() { return handle_.get(); }

    StreamImage image_;
    Handle handle_;
};

// ---- Where the fork is --------------------------------------------------------------------------

TEST_F(EasForkTest, TheFinderInfoIsInEitherPlaceOfTheHeader) {
    OpenWith({.attributes = {{"a", Ascii("xyz")}}, .fork = Pattern(9)});
    unsigned start = 0;
    unsigned length = 0;
    EXPECT_EQ(0, EASGetFinderInfoIndex(h()));
    EXPECT_EQ(0, EASGetRForkRange(h(), &start, &length));
    EXPECT_EQ(139u, start);
    EXPECT_EQ(9u, length);

    PutU32(h()->header, kFinderIdAt, 2);
    PutU32(h()->header, kFinderLengthAt, 1234);
    PutU32(h()->header, kForkIdAt, 9);
    PutU32(h()->header, kForkOffsetAt, 50);
    PutU32(h()->header, kForkLengthAt, 100);
    EXPECT_EQ(1, EASGetFinderInfoIndex(h()));
    EXPECT_EQ(0, EASGetRForkRange(h(), &start, &length));
    EXPECT_EQ(150u, start);
    EXPECT_EQ(1234u, length);

    // Both are: the first.
    PutU32(h()->header, kFinderIdAt, 9);
    EXPECT_EQ(0, EASGetFinderInfoIndex(h()));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasForkTest, AHeaderWithoutFinderInfoHasNoForkRange) {
    OpenWith({});
    unsigned start = 77;
    unsigned length = 78;
    PutU32(h()->header, kFinderIdAt, 0x10009);
    EXPECT_EQ(-1, EASGetFinderInfoIndex(h()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_get_finderinfo_index")));
    EXPECT_EQ(-1, EASGetRForkRange(h(), &start, &length));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "eas_get_finderinfo_index")));
    EXPECT_EQ(77u, start);
    EXPECT_EQ(78u, length);

    PutU32(h()->header, kFinderIdAt, 9);
    PutU16(h()->header, kDescriptorCountAt, 13);
    EXPECT_EQ(0, EASGetFinderInfoIndex(h()));
    PutU16(h()->header, kDescriptorCountAt, 14);
    EXPECT_EQ(-1, EASGetFinderInfoIndex(h()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_get_finderinfo_index")));
    EXPECT_EQ(-1, EASGetFinderInfoIndex(nullptr));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_get_finderinfo_index")));
}

TEST_F(EasForkTest, ARangeWithoutItsArgumentsFailsWithoutARecord) {
    OpenWith({});
    unsigned value = 0;
    EXPECT_EQ(-1, EASGetRForkRange(nullptr, &value, &value));
    EXPECT_EQ(-1, EASGetRForkRange(h(), nullptr, &value));
    EXPECT_EQ(-1, EASGetRForkRange(h(), &value, nullptr));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

// ---- Moving bytes -------------------------------------------------------------------------------

TEST_F(EasForkTest, UpwardsTheLastChunkGoesFirst) {
    const Bytes fork = Pattern(40000);
    Fill(Repeat(0xEE, 200) + fork + Repeat(0xDD, 100));
    EXPECT_EQ(0, EASMoveRFork(fd_, 40000, 300, 200, kBackwards));
    EXPECT_THAT(TakeCalls(),
                ElementsAre("pread(16384, 23816)", "pwrite(16384, 23916)", "pread(16384, 7432)",
                            "pwrite(16384, 7532)", "pread(7232, 200)", "pwrite(7232, 300)"));
    EXPECT_EQ(Repeat(0xEE, 200) + Bytes(fork.begin(), fork.begin() + 100) + fork, Contents());
}

TEST_F(EasForkTest, DownwardsTheFirstChunkGoesFirst) {
    const Bytes fork = Pattern(40000);
    Fill(Repeat(0xEE, 300) + fork);
    EXPECT_EQ(0, EASMoveRFork(fd_, 40000, 200, 300, kForwards));
    EXPECT_THAT(TakeCalls(),
                ElementsAre("pread(16384, 300)", "pwrite(16384, 200)", "pread(16384, 16684)",
                            "pwrite(16384, 16584)", "pread(7232, 33068)", "pwrite(7232, 32968)"));
    EXPECT_EQ(Repeat(0xEE, 200) + fork + Bytes(fork.end() - 100, fork.end()), Contents());
}

TEST_F(EasForkTest, WholeChunksAndSingleBytesAreMoved) {
    for (const unsigned length : {0u, 1u, 16383u, 16384u, 16385u, 32768u}) {
        SCOPED_TRACE(length);
        const Bytes fork = Pattern(length);
        Fill(Repeat(0xEE, 10) + fork);
        TakeCalls();
        EXPECT_EQ(0, EASMoveRFork(fd_, length, 17, 10, kBackwards));
        EXPECT_EQ((length + 16383) / 16384 * 2, TakeCalls().size());
        EXPECT_EQ(fork, Contents(length, 17));
        EXPECT_EQ(0, EASMoveRFork(fd_, length, 3, 17, kForwards));
        EXPECT_EQ((length + 16383) / 16384 * 2, TakeCalls().size());
        EXPECT_EQ(fork, Contents(length, 3));
    }
}

TEST_F(EasForkTest, RangesNearFourGigabytesAreMoved) {
    const Bytes fork = Pattern(20000);
    ASSERT_EQ(20000, ::pwrite(fd_, fork.data(), fork.size(), 0xFFFFA000));
    EXPECT_EQ(0, EASMoveRFork(fd_, 20000, 0xFFFFF000u, 0xFFFFA000u, kBackwards));
    EXPECT_EQ(fork, Contents(20000, 0xFFFFF000));
    EXPECT_EQ(0, EASMoveRFork(fd_, 20000, 0x80000000u, 0xFFFFF000u, kForwards));
    EXPECT_EQ(fork, Contents(20000, 0x80000000));
}

TEST_F(EasForkTest, TheEndOfTheFileEndsTheMove) {
    const Bytes there = Pattern(20000);
    Fill(there);
    EXPECT_EQ(0, EASMoveRFork(fd_, 0x7FFFFFFF, 0, 100, kForwards));
    EXPECT_EQ(Bytes(there.begin() + 100, there.end()), Contents(19900));
    EXPECT_EQ(20000u, FileSize());
    EXPECT_EQ(0, EASMoveRFork(fd_, 100, 0, 50000, kForwards));
    EXPECT_EQ(0, EASMoveRFork(fd_, 100, 60000, 50000, kBackwards));
    EXPECT_EQ(20000u, FileSize());
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(EasForkTest, AReadThatComesBackShortLosesNothing) {
    const Bytes fork = Pattern(40000);
    for (const bool backwards : {kForwards, kBackwards}) {
        for (const int nth : {1, 2, 3}) {
            SCOPED_TRACE(nth);
            Fill(Repeat(0xEE, 300) + fork);
            const unsigned to = backwards ? 500 : 200;
            const ShortCall fault("pread", nth, 1000, true);
            EXPECT_EQ(0, EASMoveRFork(fd_, 40000, to, 300, backwards));
            EXPECT_TRUE(fault.fired());
            EXPECT_EQ(fork, Contents(40000, to));
        }
    }
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// Promise: "MAVOEASWrite: the log has its cause"
TEST_F(EasForkTest, AFailedReadIsLoggedAndItsCauseReturned) {
    struct Case {
        int error, result;
        const char* reason;
    };
    for (const Case& c :
         {Case{EIO, -13, "Input/output error"}, Case{ENOSPC, -5, "No space left on device"},
          Case{EACCES, -5, "Permission denied"}}) {
        for (const bool backwards : {kForwards, kBackwards}) {
            SCOPED_TRACE(c.reason);
            Fill(Pattern(30000));
            {
                const FailCall fault("pread", c.error);
                EXPECT_EQ(c.result, EASMoveRFork(fd_, 20000, 0, 100, backwards));
                EXPECT_EQ(c.error, errno);
            }
            {
                const FailCall fault("pread", c.error, 2);
                EXPECT_EQ(c.result, EASMoveRFork(fd_, 20000, 0, 100, backwards));
            }
            const std::string line =
                "eas_move_rfork:LINE(EASMoveRFork) failed to read, cRead=-1, cToRead=";
            EXPECT_THAT(TakeLog(), ElementsAre(line + "16384, reason=" + c.reason + ".",
                                               line + "3616, reason=" + c.reason + "."));
            EXPECT_THAT(TakeRecords(), IsEmpty());
        }
    }
}

// Promise: "MAVOEASWrite: the log has its cause"
TEST_F(EasForkTest, AFailedWriteIsLoggedAndItsCauseReturned) {
    struct Case {
        int error, result;
        const char* reason;
    };
    for (const Case& c :
         {Case{EIO, -13, "Input/output error"}, Case{ENOSPC, -9, "No space left on device"},
          Case{EACCES, -5, "Permission denied"}}) {
        for (const bool backwards : {kForwards, kBackwards}) {
            SCOPED_TRACE(c.reason);
            Fill(Pattern(30000));
            const FailCall fault("pwrite", c.error, 2);
            EXPECT_EQ(c.result, EASMoveRFork(fd_, 20000, 0, 100, backwards));
            EXPECT_EQ(c.error, errno);
            EXPECT_THAT(TakeLog(),
                        ElementsAre("eas_move_rfork:LINE(EASMoveRFork) failed to write, reason=" +
                                    std::string(c.reason) + "."));
            EXPECT_THAT(TakeRecords(), IsEmpty());
        }
    }
}

TEST_F(EasForkTest, AWriteThatStopsShortIsAFailedOne) {
    Fill(Pattern(30000));
    const ShortCall fault("pwrite", 1, 1000);
    errno = 0;
    EXPECT_LT(EASMoveRFork(fd_, 20000, 0, 100, kForwards), 0);
    EXPECT_THAT(
        TakeLog(),
        ElementsAre(StartsWith("eas_move_rfork:LINE(EASMoveRFork) failed to write, reason=")));
}

// ---- Shifting -----------------------------------------------------------------------------------

TEST_F(EasForkTest, ShiftMakesTheFileLongEnoughFirst) {
    OpenWith({});
    const Bytes fork = Pattern(20000);
    Fill(Repeat(0xEE, 100) + fork);
    TakeCalls();
    EXPECT_EQ(0, EASShiftRFork(h(), 150, 100, 20000));
    EXPECT_THAT(TakeFileCalls(),
                ElementsAre("ftruncate(20150)", "pread(16384, 3716)", "pwrite(16384, 3766)",
                            "pread(3616, 100)", "pwrite(3616, 150)"));
    EXPECT_EQ(fork, Contents(20000, 150));
    EXPECT_EQ(20150u, FileSize());
}

TEST_F(EasForkTest, ShiftDownLeavesTheFilesLength) {
    OpenWith({});
    const Bytes fork = Pattern(100);
    Fill(Repeat(0xEE, 100) + fork);
    TakeCalls();
    EXPECT_EQ(0, EASShiftRFork(h(), 50, 100, 100));
    EXPECT_THAT(TakeFileCalls(), ElementsAre("pread(100, 100)", "pwrite(100, 50)"));
    EXPECT_EQ(fork, Contents(100, 50));
    EXPECT_EQ(200u, FileSize());
}

TEST_F(EasForkTest, ShiftByNothingOrOfNothingDoesNothing) {
    OpenWith({});
    Fill(Pattern(100));
    TakeCalls();
    EXPECT_EQ(0, EASShiftRFork(h(), 50, 50, 50));
    EXPECT_EQ(0, EASShiftRFork(h(), 5000, 50, 0));
    EXPECT_EQ(0, EASShiftRFork(h(), 5, 50, 0));
    EXPECT_THAT(TakeFileCalls(), IsEmpty());
    EXPECT_EQ(Pattern(100), Contents());
}

TEST_F(EasForkTest, ShiftNeedsAHandleAndADescriptor) {
    OpenWith({});
    EXPECT_EQ(-1, EASShiftRFork(nullptr, 1, 0, 1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_move_rfork")));
    h()->fd = -1;
    EXPECT_EQ(-1, EASShiftRFork(h(), 1, 0, 1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_move_rfork")));
    EXPECT_EQ(-1, EASShiftRFork(h(), 1, 1, 0));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "eas_move_rfork")));
    h()->fd = fd_;
}

TEST_F(EasForkTest, ShiftThatFailsRecordsNothing) {
    OpenWith({});
    for (const std::string call : {"ftruncate", "pread", "pwrite"}) {
        SCOPED_TRACE(call);
        Fill(Pattern(200));
        const FailCall fault(call, ENOSPC);
        EXPECT_EQ(-1, EASShiftRFork(h(), 150, 100, 100));
        EXPECT_EQ(ENOSPC, errno);
        EXPECT_TRUE(fault.fired());
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_EQ(call == "ftruncate" ? 0u : 1u, TakeLog().size());
    }
}

// ---- Beneath attributes -------------------------------------------------------------------------

// Promise: "EA stream: Four regions"
// Promise: "Streams: A stream is rewritten in place"
TEST_F(EasForkTest, AWriteMovesTheForkThenWritesThenSyncs) {
    OpenWith({.attributes = {{"a", Ascii("xyz")}}, .fork = Pattern(40000)});
    ASSERT_EQ(9, Write(handle_, "b", "123456789"));
    // From 139 to 139 + 16 + 9.
    EXPECT_THAT(TakeWrites(),
                ElementsAre("ftruncate(40164)", "pwrite(16384, 23780)", "pwrite(16384, 7396)",
                            "pwrite(7232, 164)", WriteOfAll(164), "fsync()"));
    image_.attributes.push_back({"b", Ascii("123456789")});
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasForkTest, ARemovalMovesTheForkThenWritesThenCutsThenSyncs) {
    OpenWith(
        {.attributes = {{"a", Ascii("xyz")}, {"b", Ascii("123456789")}}, .fork = Pattern(40000)});
    ASSERT_EQ(0, MAVOEASRemove(h(), "a"));
    // From 164 to 164 - 16 - 3.
    EXPECT_THAT(TakeWrites(),
                ElementsAre("pwrite(16384, 145)", "pwrite(16384, 16529)", "pwrite(7232, 32913)",
                            WriteOfAll(145), "ftruncate(40145)", "fsync()"));
    image_.attributes.erase(image_.attributes.begin());
    EXPECT_EQ(image_.Build(), Contents());
}

TEST_F(EasForkTest, AnOverwriteOfEqualSizeDoesNotTouchTheFork) {
    OpenWith({.attributes = {{"a", Ascii("xyz")}, {"b", Ascii("12")}}, .fork = Pattern(40000)});
    ASSERT_EQ(3, Write(handle_, "a", "XYZ"));
    for (const std::string& call : TakeFileCalls()) {
        EXPECT_THAT(call, ::testing::AnyOf(StartsWith("preadv("), WriteOfAll(157), "fsync()"));
    }
    image_.attributes = {{"b", Ascii("12")}, {"a", Ascii("XYZ")}};
    EXPECT_EQ(image_.Build(), Contents());
}

// Promise: "MAVOEASWrite: A failure to move"
TEST_F(EasForkTest, AWriteWhoseForkCannotMoveRecordsNothingAndLeavesTheHeader) {
    for (const std::string call : {"ftruncate", "pread", "pwrite"}) {
        SCOPED_TRACE(call);
        OpenWith({.attributes = {{"a", Ascii("xyz")}}, .fork = Pattern(40000)});
        const Bytes head = Contents(139);
        {
            const FailCall fault(call, ENOSPC, 0);
            EXPECT_EQ(-1, Write(handle_, "a", "longer"));
            EXPECT_EQ(ENOSPC, errno);
            EXPECT_TRUE(fault.fired());
        }
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_EQ(call == "ftruncate" ? 0u : 1u, TakeLog().size());
        EXPECT_EQ(head, Contents(139));
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        EXPECT_EQ(Ascii("xyz"), Read(handle_, "a"));
    }
}

TEST_F(EasForkTest, ACrashAfterTheMoveLeavesTheOldHeaderBeforeAForkInItsNewPlace) {
    OpenWith({.attributes = {{"a", Ascii("xyz")}}, .fork = Pattern(5000)});
    const Bytes head = Contents(139);
    {
        const FailCall fault("pwrite", EIO, 2);  // the first moves the fork
        EXPECT_EQ(-1, Write(handle_, "a", "longer"));
        EXPECT_EQ(EIO, errno);
    }
    EXPECT_THAT(TakeCodes(), ElementsAre(0xB00));
    EXPECT_EQ(head, Contents(139));
    EXPECT_EQ(Pattern(5000), Contents(5000, 142));
}

// Promise: "EA stream: A fork that is longer"
TEST_F(EasForkTest, AForkThatPassesTheEndOfTheFileMovesTheBytesThatAreThere) {
    for (const std::size_t there : {0u, 1u, 300u, 20000u}) {
        for (const std::uint32_t declared : {20001u, 0x7FFFFFFFu}) {
            SCOPED_TRACE(std::to_string(there) + " of " + std::to_string(declared));
            image_ = {.attributes = {{"a", Ascii("xyz")}, {"b", Ascii("2")}},
                      .fork = Pattern(there)};
            Bytes bytes = image_.Build();
            PutU32(bytes, kForkLengthAt, declared);
            handle_.reset();
            Fill(bytes);
            handle_ = Open();
            ASSERT_NE(nullptr, handle_);
            ASSERT_EQ(2, Write(handle_, "c", "33"));
            image_.attributes.push_back({"c", Ascii("33")});
            bytes = image_.Build();
            PutU32(bytes, kForkLengthAt, declared);
            EXPECT_EQ(bytes, Contents());
            ASSERT_EQ(0, MAVOEASRemove(h(), "a"));
            image_.attributes.erase(image_.attributes.begin());
            bytes = image_.Build();
            PutU32(bytes, kForkLengthAt, declared);
            EXPECT_EQ(bytes, Contents(bytes.size()));
            EXPECT_LE(FileSize(), bytes.size() + 20);
            EXPECT_THAT(TakeRecords(), IsEmpty());
        }
    }
}

// Promise: "EA stream: A fork whose descriptor"
TEST_F(EasForkTest, AForkThatDoesNotLieWhereTheLayoutPutsItIsNotMoved) {
    const StreamImage image{.attributes = {{"a", Ascii("xyz")}, {"b", Ascii("2")}},
                            .fork = Pattern(200)};
    struct Case {
        std::size_t field;
        std::uint32_t value;
    };
    const std::uint32_t total = image.TotalSize();
    for (const Case& c : {Case{kForkOffsetAt, total + 1}, Case{kForkOffsetAt, total - 1},
                          Case{kForkOffsetAt, 0}, Case{kForkOffsetAt, 0xFFFFFFFF},
                          Case{kFinderLengthAt, total - 49}, Case{kFinderLengthAt, total - 51},
                          Case{kFinderLengthAt, 0}, Case{kFinderLengthAt, 0xFFFFFFFF}}) {
        SCOPED_TRACE(std::to_string(c.field) + " " + std::to_string(c.value));
        Bytes bytes = image.Build();
        PutU32(bytes, c.field, c.value);
        handle_.reset();
        Fill(bytes);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        const HandleState before = StateOf(*h());
        EXPECT_EQ(-1, Write(handle_, "c", "3"));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
        EXPECT_EQ(-1, Write(handle_, "a", "xyzw"));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
        EXPECT_EQ(-1, MAVOEASRemove(h(), "a"));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
        EXPECT_EQ(bytes, Contents());
        EXPECT_TRUE(before == StateOf(*h()));
        EXPECT_EQ(Ascii("xyz"), Read(handle_, "a"));
    }
}

// Promise: "EA streams: attributes: A stream whose offsets"
TEST_F(EasForkTest, AForkInsideTheDataAreaIsNotMoved) {
    const StreamImage image{.attributes = {{"a", Ascii("xyz")}}, .fork = Pattern(200)};
    for (const std::uint32_t fork_at : {83u, 120u, 135u, 138u}) {
        SCOPED_TRACE(fork_at);
        Bytes bytes = image.Build();
        PutU32(bytes, kFinderLengthAt, fork_at - 50);
        PutU32(bytes, kForkOffsetAt, fork_at);
        handle_.reset();
        Fill(bytes);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        EXPECT_EQ(-1, Write(handle_, "c", "3"));
        EXPECT_EQ(-1, MAVOEASRemove(h(), "a"));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00, 0xA00));
        EXPECT_EQ(bytes, Contents());
    }
}

TEST_F(EasForkTest, AForkInsideTheHeaderIsNotMoved) {
    const StreamImage image{.fork = Pattern(200)};
    for (const std::uint32_t fork_at : {0u, 81u, 83u, 119u}) {
        SCOPED_TRACE(fork_at);
        Bytes bytes = image.Build();
        PutU32(bytes, kFinderLengthAt, fork_at - 50);
        PutU32(bytes, kForkOffsetAt, fork_at);
        handle_.reset();
        Fill(bytes);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        EXPECT_EQ(-1, Write(handle_, "c", "3"));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
        EXPECT_EQ(bytes, Contents());
    }
}

TEST_F(EasForkTest, APlainFileWhoseForkIsNotBehindItsFinderInfoIsNotRewritten) {
    for (const std::uint32_t fork_at : {83u, 81u, 20u, 0x10000000u}) {
        SCOPED_TRACE(fork_at);
        Bytes bytes = PlainAppleDouble(Pattern(32), Pattern(500));
        PutU32(bytes, kForkOffsetAt, fork_at);
        handle_.reset();
        Fill(bytes);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        EXPECT_EQ(-1, Write(handle_, "a", "1"));
        EXPECT_THAT(TakeCodes(), ElementsAre(0xA00));
        EXPECT_EQ(bytes, Contents());
    }
}

TEST_F(EasForkTest, WhereAnEmptyForkIsSaidToLieDoesNotMatter) {
    StreamImage image{.attributes = {{"a", Ascii("xyz")}}};
    for (const std::uint32_t fork_at : {0u, 82u, 138u, 140u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(fork_at);
        Bytes bytes = image.Build();
        PutU32(bytes, kForkOffsetAt, fork_at);
        handle_.reset();
        Fill(bytes);
        handle_ = Open();
        ASSERT_NE(nullptr, handle_);
        ASSERT_EQ(3, Write(handle_, "a", "XYZ"));
        StreamImage after = image;
        after.attributes[0].value = Ascii("XYZ");
        EXPECT_EQ(after.Build(), Contents());
        EXPECT_THAT(TakeRecords(), IsEmpty());
    }
}

}  // namespace
}  // namespace mavoea::test

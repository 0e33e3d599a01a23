// Copying to and from the "._" files of AppleDouble volumes, and from EA directories to file-EA
// volumes.

#include <fcntl.h>

#include <algorithm>
#include <string>
#include <vector>

#include "ops/ea_copy.h"
#include "tests/support/copy_fixture.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_fixture.h"
#include "tests/support/working_directory.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;

constexpr char kRecord[] = "user.netatalk.Metadata";
constexpr char kFlushTime[] = "user.mavo.filea.flushtime";

const Bytes kInfo = Pattern(32, 3);
const Bytes kForkBytes = Pattern(20'000, 5);  // more than is copied at once

// Finder info at 50 and fork at 82, behind a header with that filler.
Bytes Rewritten(const Bytes& finder_info, const Bytes& fork,
                const Bytes& filler = Ascii("Mac OS X        ")) {
    Bytes length(4);
    PutU32(length, 0, fork.size());
    return Hex("00 05 16 07  00 02 00 00") + filler +
           Hex("00 02  00 00 00 09  00 00 00 32  00 00 00 20  00 00 00 02  00 00 00 52") + length +
           finder_info + fork;
}

class AppleDoubleTest : public CopyTest {
 protected:
    AppleDoubleTest() { FixTime(); }

    static void FixTime() {
        Hooks().time = [] { return time_t{0x12345678}; };
    }
    void Restart() {
        Reset();
        FixTime();
    }

    // Two attributes, Finder info and fork, as Macs have them in one file.
    static StreamImage Whole() {
        return {.attributes = {{"user.one", Ascii("1")}, {"user.two", Pattern(3000, 2)}},
                .fork = kForkBytes,
                .finder_info = kInfo};
    }
    static StreamImage AttributesOnly() { return {.attributes = Whole().attributes}; }

    std::string Pair() const { return "[" + src_ + "]->[" + dst_ + "]"; }

    // The calls to the platform that run a program.
    static std::vector<std::string> TakePrograms() {
        std::vector<std::string> calls = TakePlatformCalls();
        std::erase_if(calls,
                      [](const std::string& call) { return !call.starts_with("MLIBCExec"); });
        return calls;
    }

    // Whether a rewrite could not look up where the entries are. It then takes them from where they
    // are in most files and succeeds, with whatever is there.
    static bool WentOnWithDefaults() {
        const std::vector<std::string> log = TakeLog();
        return std::any_of(log.begin(), log.end(), [](const std::string& line) {
            return line.find("(EAGetEntriesBuf)") != std::string::npos;
        });
    }

    static void AnswerOfPrograms(int result, int error) {
        Platform().exec = [=](const std::vector<std::string>&) {
            errno = error;
            return result;
        };
    }

    static void RefuseToSet(const std::string& name, int nth = 1) {
        const auto set = Hooks().setxattr;
        Hooks().setxattr = [=](const char* path, const char* it, const void* value, size_t size,
                               int flags) mutable {
            if (it == name && --nth == 0) {
                errno = EPERM;
                return -1;
            }
            return set(path, it, value, size, flags);
        };
    }

    // The destination's record has that Finder info, and the flush time is set.
    void ExpectFileEA(const Bytes& finder_info) const {
        Attributes found = AttributesOf(dst_);
        ASSERT_EQ(402u, found[kRecord].size());
        EXPECT_EQ(finder_info, Bytes(found[kRecord].begin() + 122, found[kRecord].begin() + 154));
        EXPECT_EQ(Hex("12 34 56 78"), found[kFlushTime]);
    }
};

// ---- "._" file to "._" file -----------------------------------------------------------------

class DoubleToDoubleTest : public AppleDoubleTest {
 protected:
    int Copy(int move) const { return EACopyADFStoADFS(src_.c_str(), dst_.c_str(), move); }
};

TEST_F(DoubleToDoubleTest, TheFileIsCopiedByTheProgramAsItIs) {
    for (const int move : {0, 1, 2}) {
        Restart();
        Put(SrcDouble(), Ascii("anything"));
        EXPECT_EQ(0, Copy(move));
        EXPECT_THAT(TakePrograms(), ElementsAre("MLIBCExec(/bin/cp, -f, " + SrcDouble() + ", " +
                                                DstDouble() + ")"));
        EXPECT_EQ(Ascii("anything"), Content(DstDouble()));
        EXPECT_EQ(move == 0, Exists(SrcDouble()));
        ExpectNothingReported();
    }
}

TEST_F(DoubleToDoubleTest, AMissingFileIsLeftToTheProgramWhosePositiveStatusIsNoFailure) {
    for (const int move : {0, 1}) {
        AnswerOfPrograms(1, ENOENT);
        EXPECT_EQ(0, Copy(move));
        EXPECT_EQ(1u, TakePrograms().size());
        EXPECT_FALSE(Exists(DstDouble()));
        ExpectNothingReported();
    }
}

TEST_F(DoubleToDoubleTest, AFailedCopyIsLoggedAndTheSourceStays) {
    Put(SrcDouble(), Ascii("anything"));
    AnswerOfPrograms(-1, EIO);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre("ea_copy.c:LINE(EACopyADFStoADFS) Failed to cp -f " +
                                         SrcDouble() + "."));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_TRUE(Exists(SrcDouble()));
}

TEST_F(DoubleToDoubleTest, ASourceThatCannotBeRemovedIsLogged) {
    Put(SrcDouble(), Ascii("anything"));
    const FailCall fault("unlink", EACCES);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("none", "Failed to remove [" + SrcDouble() +
                                                             "]. Permission denied")));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_TRUE(Exists(DstDouble()));
}

TEST_F(DoubleToDoubleTest, ANameThatIsTooLongGivesMinus3AndALineForEachPath) {
    Put(SrcDouble(), Ascii("anything"));
    const std::string long_src = from_ + "/" + std::string(254, 'n');
    const std::string long_dst = to_ + "/" + std::string(254, 'n');
    const std::string pairs[][2] = {{long_src, dst_}, {src_, long_dst}, {long_src, long_dst}};
    for (const auto& [src, dst] : pairs) {
        EXPECT_EQ(-3, EACopyADFStoADFS(src.c_str(), dst.c_str(), 1));
        EXPECT_THAT(TakeLines(), ElementsAre(Line("filename too long: [" + src + "]."),
                                             Line("filename too long: [" + dst + "].")));
        EXPECT_THAT(Codes("ea_adpath"), ElementsAre(0xC300));
        EXPECT_THAT(TakePrograms(), IsEmpty());
        EXPECT_TRUE(Exists(SrcDouble()));
    }
    const std::string longest = to_ + "/" + std::string(253, 'n');
    EXPECT_EQ(0, EACopyADFStoADFS(src_.c_str(), longest.c_str(), 0));
    EXPECT_EQ(Ascii("anything"), Content(to_ + "/._" + std::string(253, 'n')));
}

TEST_F(DoubleToDoubleTest, AnyOtherFailureOfAPathGivesMinus1) {
    EXPECT_EQ(-1, EACopyADFStoADFS(nullptr, dst_.c_str(), 0));
    EXPECT_EQ(-1, EACopyADFStoADFS(src_.c_str(), nullptr, 0));
    EXPECT_THAT(TakePrograms(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(DoubleToDoubleTest, ATooLongNameOfAnOperationBeforeDoesNotCount) {
    MLIBCErrSetEx(0xC300, "other.c", 1);  // of an operation before
    EXPECT_EQ(-1, EACopyADFStoADFS(nullptr, dst_.c_str(), 0));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// ---- "._" file to EA directory --------------------------------------------------------------

class DoubleToEADirTest : public AppleDoubleTest {
 protected:
    int Copy(int move) const { return EACopyADFSToEADirFS(src_.c_str(), dst_.c_str(), move); }

    std::string CannotCopy(int reason) const {
        return Line("Failed to copy " + SrcDouble() + " to " + DstResource() +
                    ", reason = " + std::to_string(reason) + ".");
    }
};

TEST_F(DoubleToEADirTest, FinderInfoAndForkGoIntoTheResourceFileAttributesIntoTheStream) {
    const Umask mask(077);
    for (const int move : {0, 1, 2}) {
        Restart();
        Put(SrcDouble(), Whole().Build());
        EXPECT_EQ(0, Copy(move));
        EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstResource()));
        EXPECT_EQ(AttributesOnly().Build(), Content(DstStream()));
        EXPECT_EQ(0777, ModeOf(DstResource()));
        EXPECT_EQ(0777, ModeOf(DstStream()));
        EXPECT_EQ(move == 0, Exists(SrcDouble()));
        EXPECT_THAT(TakePrograms(), IsEmpty());
        ExpectNothingReported();
        ExpectNothingHeld();
    }
}

TEST_F(DoubleToEADirTest, WithoutAttributesThereIsNoStream) {
    Put(SrcDouble(), PlainAppleDouble(kInfo, kForkBytes, 13));
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes, Repeat(0, 16)), Content(DstResource()));
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoResource"));
    ExpectNothingReported();
}

TEST_F(DoubleToEADirTest, WithoutADoubleThereIsNothingToDoButTheRemoval) {
    for (const int move : {0, 1}) {
        TakeCalls();
        EXPECT_EQ(0, Copy(move));
        const std::string removal = "unlink(" + SrcDouble() + ")";
        EXPECT_EQ(move != 0, testing::Value(TakeCalls(), Contains(removal)));
        EXPECT_FALSE(Exists(EADir(to_)));
        ExpectNothingReported();
    }
}

TEST_F(DoubleToEADirTest, AnEmptyDoubleConvertsToNothing) {
    Put(SrcDouble(), {});
    EXPECT_EQ(0, Copy(1));
    EXPECT_THAT(NamesIn(EADir(to_)), IsEmpty());
    EXPECT_FALSE(Exists(SrcDouble()));
    ExpectNothingReported();
}

TEST_F(DoubleToEADirTest, AttributesJoinThoseOfTheStreamThatExistsAndReplaceThemByName) {
    Put(SrcDouble(), Whole().Build());
    Put(DstStream(), StreamImage{.attributes = {{"user.one", Ascii("longer than 1")},
                                                {"user.kept", Ascii("kept")}}}
                         .Build());
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ((StreamImage{.attributes = {{"user.kept", Ascii("kept")},
                                          {"user.one", Ascii("1")},
                                          {"user.two", Pattern(3000, 2)}}}
                   .Build()),
              Content(DstStream()));
}

TEST_F(DoubleToEADirTest, NoNameIsRefused) {
    const WorkingDirectory here(to_);
    Put(SrcDouble(), Whole().Build());
    EXPECT_EQ(0, EACopyADFSToEADirFS(src_.c_str(), "Icon\r", 0));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(EADir(to_) + "/Icon\r@MavoResource"));
    EXPECT_EQ(0, EACopyADFSToEADirFS(src_.c_str(), "._a:b*", 0));
    EXPECT_TRUE(Exists(EADir(to_) + "/._a:b*@MavoResource"));
}

TEST_F(DoubleToEADirTest, Version1IsRefusedAndNothingWritten) {
    Bytes file = Whole().Build();
    PutU32(file, 4, 0x00010000);
    Put(SrcDouble(), file);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Line("Apple double v1 doens't support now"), CannotCopy(-1)));
    EXPECT_THAT(NamesIn(EADir(to_)), IsEmpty());
    EXPECT_TRUE(Exists(SrcDouble()));
}

TEST_F(DoubleToEADirTest, ATableOf3EntriesIsRefusedAndNoResourceFileLeft) {
    Put(SrcDouble(), PlainAppleDouble(kInfo, kForkBytes, 3));
    EXPECT_EQ(-1, Copy(1));
    EXPECT_EQ(CannotCopy(-5), TakeLines().back());
    EXPECT_THAT(NamesIn(EADir(to_)), IsEmpty());
    EXPECT_TRUE(Exists(SrcDouble()));
    ExpectNothingHeld();
}

TEST_F(DoubleToEADirTest, ANameThatIsTooLongGivesMinus3AndALineForTheSource) {
    const std::string src = from_ + "/" + std::string(254, 'n');
    EXPECT_EQ(-3, EACopyADFSToEADirFS(src.c_str(), dst_.c_str(), 1));
    EXPECT_THAT(TakeLines(), ElementsAre(Line("filename too long: [" + src + "].")));
    EXPECT_FALSE(Exists(EADir(to_)));
}

TEST_F(DoubleToEADirTest, APathThatCannotBeBuiltIsLoggedWithItsRecord) {
    EXPECT_EQ(-1, EACopyADFSToEADirFS(nullptr, dst_.c_str(), 1));
    EXPECT_THAT(TakeLines(), ElementsAre(Line("Fail to generate path.[0x0D00 ea_adpath:LINE]")));
}

TEST_F(DoubleToEADirTest, ADestinationPathThatIsTooLongGivesMinus3) {
    Put(SrcDouble(), Whole().Build());
    const std::string dst = to_ + std::string(4100, '/') + "b";
    EXPECT_EQ(-3, EACopyADFSToEADirFS(src_.c_str(), dst.c_str(), 1));
    EXPECT_EQ(Line("filename too long: [" + dst + "]."), TakeLines().back());
    EXPECT_TRUE(Exists(SrcDouble()));
    ExpectNothingHeld();
}

TEST_F(DoubleToEADirTest, ADestinationPathThatIsTooLongForTheResourceFileAloneGivesMinus3) {
    Put(SrcDouble(), Whole().Build());
    const std::string dst = to_ + std::string(4075 - to_.size() - 1, '/') + "b";
    EXPECT_EQ(-3, EACopyADFSToEADirFS(src_.c_str(), dst.c_str(), 1));
    EXPECT_EQ(Line("filename too long: [" + dst + "]."), TakeLines().back());
    EXPECT_THAT(NamesIn(EADir(to_)), IsEmpty());
    EXPECT_TRUE(Exists(SrcDouble()));
    const std::string longest = to_ + std::string(4074 - to_.size() - 1, '/') + "b";
    EXPECT_EQ(0, EACopyADFSToEADirFS(src_.c_str(), longest.c_str(), 1));
}

TEST_F(DoubleToEADirTest, AnEADirectoryThatCannotBeMadeIsLoggedWithItsRecord) {
    Put(SrcDouble(), Whole().Build());
    dst_ = to_ + "/missing/b";
    EXPECT_EQ(-1, Copy(1));
    EXPECT_EQ(Line("Fail to generate path.[0x3C00 ea_mkdir.c:LINE]"), TakeLines().back());
    EXPECT_TRUE(Exists(SrcDouble()));
}

// Promise: "MAVOEACopyEx: What has been done"
TEST_F(DoubleToEADirTest, AStreamThatCannotBeOpenedFailsWith0x900AndTheResourceFileStays) {
    Put(SrcDouble(), Whole().Build());
    PutLoop(DstStream());
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_copy.c")));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("0x0900 ea_copy.c", "Failed to cp " + Pair() +
                                                                         ". " + strerror(ELOOP))));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstResource()));
    EXPECT_TRUE(Exists(SrcDouble()));
    ExpectNothingHeld();
}

TEST_F(DoubleToEADirTest, AStreamThatHasNoPlaceFailsWithoutARecord) {
    Put(SrcDouble(), Whole().Build());
    (void)TakeCallNames();
    EXPECT_EQ(0, Copy(0));
    const std::vector<std::string> calls = TakeCallNames();
    std::filesystem::remove_all(EADir(to_));
    // The last file that is opened is the stream.
    const FailCall gone("open", ENOENT, static_cast<int>(std::ranges::count(calls, "open")));
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(Codes(), IsEmpty());
    EXPECT_THAT(TakeLines(),
                ElementsAre(AllOf(StartsWith("ea_copy.c:LINE ["),
                                  EndsWith("]Failed to cp " + Pair() + ". " + strerror(ENOENT)))));
    EXPECT_TRUE(Exists(SrcDouble()));
}

TEST_F(DoubleToEADirTest, AStreamThatAnotherProcessHasFailsAndTheDoubleStays) {
    Put(SrcDouble(), Whole().Build());
    const StreamImage former{.attributes = {{"user.kept", Ascii("kept")}}};
    Put(DstStream(), former.Build());
    ASSERT_EQ(0, chmod(DstStream().c_str(), 0640));
    const OtherProcess other(DstStream(), F_RDLCK);
    ASSERT_EQ(0, other.code());
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(AllOf(StartsWith(Line("[0x0400 ")),
                                               HasSubstr("]Failed to cp " + Pair() + ". "))));
    EXPECT_EQ(former.Build(), Content(DstStream()));
    EXPECT_EQ(0640, ModeOf(DstStream()));  // opened to everyone on success alone
    EXPECT_TRUE(Exists(SrcDouble()));
}

TEST_F(DoubleToEADirTest, AnAttributeThatCannotBeReadFailsAndTheOthersAreCopied) {
    const StreamImage image = Whole();
    Bytes file = image.Build();
    PutU32(file, image.RecordAt(0), 0x7FFFFFF0);
    Put(SrcDouble(), file);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(AllOf(StartsWith(Line("[0x0A00 ")),
                                               HasSubstr("]Failed to cp " + Pair() + ". "))));
    EXPECT_EQ((StreamImage{.attributes = {{"user.two", Pattern(3000, 2)}}}.Build()),
              Content(DstStream()));
    EXPECT_TRUE(Exists(SrcDouble()));
    ExpectNothingHeld();
}

TEST_F(DoubleToEADirTest, AnAttributeAreaThatIsCutOffFails) {
    Bytes file = Whole().Build();
    file.resize(100);
    Put(SrcDouble(), file);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(AllOf(StartsWith(Line("[0x0A00 ")),
                                               HasSubstr("]Failed to cp " + Pair() + ". "))));
    EXPECT_FALSE(Exists(DstStream()));
    EXPECT_TRUE(Exists(SrcDouble()));
    ExpectNothingHeld();
}

TEST_F(DoubleToEADirTest, ADoubleThatCannotBeOpenedForItsAttributesFailsWith0x900) {
    Put(SrcDouble(), Whole().Build());
    MakeDirectory(EADir(to_));
    TakeCalls();
    ASSERT_EQ(0, Copy(0));
    // The last open of the "._" file is the one for the attributes.
    int opens = 0;
    int last = 0;
    for (const std::string& call : TakeCalls()) {
        if (!call.starts_with("open(")) continue;
        ++opens;
        if (call.starts_with("open(" + SrcDouble() + ",")) last = opens;
    }
    const FailCall fault("open", EMFILE, last);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(Codes(), ElementsAre(0x900));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("0x0900 ea_copy.c", "Failed to cp " + Pair() +
                                                                         ". " + strerror(EMFILE))));
    EXPECT_TRUE(Exists(SrcDouble()));
}

TEST_F(DoubleToEADirTest, ASourceThatCannotBeRemovedIsLoggedAndTheCopyStays) {
    Put(SrcDouble(), Whole().Build());
    const FailCall fault("unlink", EBUSY);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("none", "Failed to remove [" + SrcDouble() +
                                                             "]. " + strerror(EBUSY))));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstResource()));
    EXPECT_EQ(AttributesOnly().Build(), Content(DstStream()));
}

TEST_F(DoubleToEADirTest, WhateverFailsNothingIsLostAndNothingLeaks) {
    for (const int move : {0, 1}) {
        for (int nth = 1;; ++nth) {
            ASSERT_LT(nth, 500);
            Restart();
            Put(SrcDouble(), Whole().Build());
            const FailNthCall fault(nth, EIO);
            const int result = Copy(move);
            ExpectNothingHeld();
            if (!fault.fired()) {
                EXPECT_EQ(0, result);
                break;
            }
            SCOPED_TRACE(fault.name() + " " + std::to_string(nth));
            if (fault.name() == "access") continue;  // counts as no "._" file
            if (WentOnWithDefaults()) continue;
            EXPECT_TRUE(result == 0 || result == -1) << result;
            if (result == 0 || !Exists(SrcDouble())) {
                EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstResource()));
                EXPECT_EQ(AttributesOnly().Build(), Content(DstStream()));
            }
            EXPECT_TRUE(move != 0 || Exists(SrcDouble()));
        }
    }
}

// ---- The choice by destination --------------------------------------------------------------

class FromDoubleTest : public AppleDoubleTest {
 protected:
    int Copy(int move, int type) const {
        return EACopyFromADFS(src_.c_str(), dst_.c_str(), move, type);
    }
};

TEST_F(FromDoubleTest, Types0And5TakeTheDoubleAsItIs) {
    for (const int type : {0, 5}) {
        for (const int move : {0, 1, 2}) {
            Restart();
            Put(SrcDouble(), Ascii("anything"));
            EXPECT_EQ(0, Copy(move, type));
            EXPECT_EQ(Ascii("anything"), Content(DstDouble()));
            EXPECT_EQ(move == 0, Exists(SrcDouble()));
            EXPECT_FALSE(Exists(EADir(to_)));
            ExpectNothingReported();
        }
    }
    dst_ = to_ + "/" + std::string(254, 'n');
    EXPECT_EQ(-3, Copy(0, 5));
}

TEST_F(FromDoubleTest, Type7TakesRealAttributesAndIsSyncedBehindThem) {
    for (const int move : {0, 1, 2}) {
        Restart();
        StreamImage image = Whole();
        image.fork = {};
        Put(SrcDouble(), image.Build());
        EXPECT_EQ(0, Copy(move, 7));
        EXPECT_EQ((Attributes{{"user.one", Ascii("1")},
                              {"user.two", Pattern(3000, 2)},
                              {"com.apple.FinderInfo", kInfo}}),
                  AttributesOf(dst_));
        EXPECT_EQ(move == 0, Exists(SrcDouble()));
        EXPECT_EQ(1, syncs_);
        ExpectNothingReported();
        ExpectNothingHeld();
    }
}

TEST_F(FromDoubleTest, AFailureOfType7IsLoggedAndNothingSynced) {
    StreamImage image = Whole();
    image.fork = {};
    Put(SrcDouble(), image.Build());
    RefuseToSet("user.one");
    EXPECT_EQ(-1, Copy(0, 7));
    EXPECT_THAT(Codes(), ElementsAre(0xB00));
    EXPECT_THAT(
        TakeLines(),
        ElementsAre(StartsWith(Quoting("0x0B00 ea_copy.c", "Failed to cp " + Pair() + ". "))));
    EXPECT_EQ(0, syncs_);
}

TEST_F(FromDoubleTest, Types1And3And6And10TakeAnEADirectory) {
    for (const int type : {1, 3, 6, 10}) {
        for (const int move : {0, 1, 2}) {
            Restart();
            Put(SrcDouble(), Whole().Build());
            EXPECT_EQ(0, Copy(move, type));
            EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstResource()));
            EXPECT_EQ(AttributesOnly().Build(), Content(DstStream()));
            EXPECT_EQ(move == 0, Exists(SrcDouble()));
            EXPECT_THAT(AttributesOf(dst_), IsEmpty());
            ExpectNothingReported();
        }
    }
    src_ = from_ + "/" + std::string(254, 'n');
    EXPECT_EQ(-3, Copy(0, 1));
}

TEST_F(FromDoubleTest, Type2TakesAnEADirectoryAndARecordToo) {
    for (const int move : {0, 1, 2}) {
        Restart();
        Put(SrcDouble(), Whole().Build());
        EXPECT_EQ(0, Copy(move, 2));
        EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstResource()));
        EXPECT_EQ(AttributesOnly().Build(), Content(DstStream()));
        ExpectFileEA(kInfo);
        EXPECT_EQ(move == 0, Exists(SrcDouble()));
        EXPECT_THAT(TakePlatformCalls(), Not(Contains(AnyOf("MAVOGetFSType(" + src_ + ", 1)",
                                                            "MAVOGetFSType(" + dst_ + ", 1)"))));
        ExpectNothingReported();
    }
}

TEST_F(FromDoubleTest, WithoutADoubleType2StillHasItsRecord) {
    EXPECT_EQ(0, Copy(0, 2));
    ExpectFileEA(Repeat(0, 32));
}

TEST_F(FromDoubleTest, AFailedCopyToType2GivesMinus1AndNoRecord) {
    src_ = from_ + "/" + std::string(254, 'n');
    EXPECT_EQ(-1, Copy(1, 2));
    EXPECT_THAT(TakeLines(), ElementsAre(Line("filename too long: [" + src_ + "].")));
    EXPECT_THAT(AttributesOf(dst_), IsEmpty());
}

TEST_F(FromDoubleTest, AFailedSyncOfType2IsLogged) {
    Put(SrcDouble(), Whole().Build());
    RefuseToSet(kRecord);
    EXPECT_EQ(-1, Copy(1, 2));
    EXPECT_THAT(TakeLines().back(), AllOf(StartsWith("ea_copy.c:LINE ["),
                                          HasSubstr("]Failed ea sync " + Pair() + ". ")));
    EXPECT_FALSE(AttributesOf(dst_).contains(kRecord));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstResource()));
    EXPECT_FALSE(Exists(SrcDouble()));
}

TEST_F(FromDoubleTest, AFailedFlushTimeOfType2IsLogged) {
    Put(SrcDouble(), Whole().Build());
    RefuseToSet(kFlushTime, 2);  // the sync sets it once itself
    EXPECT_EQ(-1, Copy(0, 2));
    EXPECT_THAT(TakeLines().back(), AllOf(StartsWith("ea_copy.c:LINE [0x2A00 "),
                                          HasSubstr("]Failed ea write time " + Pair() + ". ")));
    ExpectFileEA(kInfo);
}

TEST_F(FromDoubleTest, OtherTypesGiveMinus4AndNothingIsTouched) {
    Put(SrcDouble(), Whole().Build());
    for (const int type : {4, 8, 9, 11, 12, 13, -1, 100}) {
        EXPECT_EQ(-4, Copy(1, type));
        EXPECT_TRUE(Exists(SrcDouble()));
        EXPECT_FALSE(Exists(EADir(to_)));
        EXPECT_FALSE(Exists(DstDouble()));
        ExpectNothingReported();
    }
}

// ---- EA directory to "._" file --------------------------------------------------------------

class ToDoubleTest : public AppleDoubleTest {
 protected:
    int Copy(int move) const { return EACopyToADFS(src_.c_str(), dst_.c_str(), move); }

    void PutResource() const { Put(SrcResource(), Rewritten(kInfo, kForkBytes)); }
    void PutAll() const {
        PutResource();
        Put(SrcStream(), AttributesOnly().Build());
    }
};

// Promise: "Where metadata lies: `D/._N`"
TEST_F(ToDoubleTest, ResourceFileAndStreamBecomeOneDouble) {
    const Umask mask(077);
    for (const int move : {0, 1, 2}) {
        Restart();
        PutAll();
        EXPECT_EQ(0, Copy(move));
        EXPECT_EQ(Whole().Build(), Content(DstDouble()));
        EXPECT_EQ(0777, ModeOf(DstDouble()));
        EXPECT_EQ(move == 0 ? 2u : 0u, NamesIn(EADir(from_)).size());
        EXPECT_FALSE(Exists(EADir(to_)));
        EXPECT_THAT(TakePlatformCalls(),
                    ElementsAre("MAVOStrReplaceFATReservedChar(" + DstDouble() + ")"));
        ExpectNothingReported();
        ExpectNothingHeld();
    }
}

TEST_F(ToDoubleTest, TheNetatalkLayoutIsRewritten) {
    Put(SrcResource(), PlainAppleDouble(kInfo, kForkBytes, 13));
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes, Repeat(0, 16)), Content(DstDouble()));
}

TEST_F(ToDoubleTest, AStreamAloneMakesADoubleOfItsOwn) {
    const Umask mask(0);
    Put(SrcStream(), AttributesOnly().Build());
    EXPECT_EQ(0, Copy(1));
    EXPECT_EQ(AttributesOnly().Build(), Content(DstDouble()));
    EXPECT_EQ(0777, ModeOf(DstDouble()));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
    ExpectNothingReported();
}

TEST_F(ToDoubleTest, WithoutMetadataNothingIsMade) {
    for (const int move : {0, 1}) {
        EXPECT_EQ(0, Copy(move));
        EXPECT_FALSE(Exists(DstDouble()));
        ExpectNothingReported();
    }
    Put(SrcResource(), {});
    Put(SrcStream(), StreamImage{}.Build());
    EXPECT_EQ(0, Copy(1));
    EXPECT_FALSE(Exists(DstDouble()));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
}

TEST_F(ToDoubleTest, AForkThatOnlySaysItIsLeftBlankBecomesEmpty) {
    Bytes fork = Pattern(286);
    const Bytes text = Ascii("This resource fork intentionally left blank   ");
    std::copy(text.begin(), text.end(), fork.begin() + 16);
    Put(SrcResource(), Rewritten(kInfo, fork));
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ(Rewritten(kInfo, {}), Content(DstDouble()));
}

TEST_F(ToDoubleTest, AttributesGoToTheNameThatFatDoesNotTakeTheRestToTheOneThatItTakes) {
    PutAll();
    dst_ = to_ + "/b:c";
    Platform().fat_replace = [](std::string path) {
        std::replace(path.begin(), path.end(), ':', '_');
        return path;
    };
    EXPECT_EQ(0, Copy(1));
    EXPECT_THAT(TakePlatformCalls(),
                ElementsAre("MAVOStrReplaceFATReservedChar(" + to_ + "/._b:c)"));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(to_ + "/._b_c"));
    EXPECT_EQ(AttributesOnly().Build(), Content(to_ + "/._b:c"));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
    ExpectNothingReported();
}

TEST_F(ToDoubleTest, AFailedReplacementGivesMinus1AndNothingIsTouched) {
    PutAll();
    Platform().fat_replace = [](const std::string&) { return std::string(5000, 'x'); };
    EXPECT_EQ(-1, Copy(1));
    EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
    EXPECT_FALSE(Exists(DstDouble()));
    ExpectNothingReported();
}

TEST_F(ToDoubleTest, AReplacementMayFill4094Bytes) {
    PutResource();
    const std::string name = "/._safe";
    const std::string path = to_ + std::string(4094 - to_.size() - name.size(), '/') + name;
    Platform().fat_replace = [&](const std::string&) { return path; };
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(to_ + name));
}

TEST_F(ToDoubleTest, RelativeIconNamesAreRefusedWithMinus32) {
    for (const std::string name : {"Icon\r", "icon\r", "ICON\r", "iCoN\r"}) {
        Restart();
        const WorkingDirectory here(to_);
        PutAll();
        EXPECT_EQ(-32, EACopyToADFS(src_.c_str(), name.c_str(), 1));
        EXPECT_THAT(TakeLines(), ElementsAre(Line("Failed to copy " + SrcResource() + " to ._" +
                                                  name + ", reason = -32.")));
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
        EXPECT_THAT(NamesIn(to_), ElementsAre("b", "b.fork"));
    }
}

TEST_F(ToDoubleTest, RelativeNamesWithReservedCharactersAreRefusedWithMinus33) {
    for (const char reserved : std::string("\\:*?\"><|\r\n")) {
        Restart();
        const WorkingDirectory here(to_);
        PutAll();
        for (const std::string& name : {std::string("x") + reserved + "y", std::string(1, reserved),
                                        std::string("x") + reserved}) {
            EXPECT_EQ(-33, EACopyToADFS(src_.c_str(), name.c_str(), 1));
            EXPECT_THAT(TakeLines(), ElementsAre(Line("Failed to copy " + SrcResource() + " to ._" +
                                                      name + ", reason = -33.")));
            EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
            EXPECT_THAT(NamesIn(to_), ElementsAre("b", "b.fork"));
        }
    }
}

TEST_F(ToDoubleTest, OtherRelativeNamesAreTaken) {
    const WorkingDirectory here(to_);
    for (const std::string name :
         {"Icon", "Icons\r", "xIcon", "two words", "it's", "\xC3\xA4\xFF", "+,;=[]", "a.b"}) {
        PutResource();
        const bool taken = name != "Icons\r";  // holds a reserved character all the same
        EXPECT_EQ(taken ? 0 : -33, EACopyToADFS(src_.c_str(), name.c_str(), 0));
        EXPECT_EQ(taken, Exists(to_ + "/._" + name));
    }
}

TEST_F(ToDoubleTest, WholePathsAreNotSubjectToTheRules) {
    PutAll();
    for (const std::string name : {"Icon\r", "a:b", "c*\n?"}) {
        EXPECT_EQ(0, EACopyToADFS(src_.c_str(), (to_ + "/" + name).c_str(), 0));
        EXPECT_EQ(Whole().Build(), Content(to_ + "/._" + name));
    }
    ExpectNothingReported();
}

TEST_F(ToDoubleTest, TheRulesLookAtTheNameThatReplacementMade) {
    PutResource();
    const WorkingDirectory here(to_);
    Platform().fat_replace = [](std::string path) {
        std::replace(path.begin(), path.end(), ':', '_');
        return path;
    };
    EXPECT_EQ(0, EACopyToADFS(src_.c_str(), "b:c", 0));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(to_ + "/._b_c"));
    Platform().fat_replace = [](const std::string&) { return std::string("._Icon\r"); };
    EXPECT_EQ(-32, EACopyToADFS(src_.c_str(), "plain", 0));
}

TEST_F(ToDoubleTest, FailuresOfTheRewriteAreReturnedAsTheyAre) {
    Bytes version1 = Rewritten(kInfo, kForkBytes);
    PutU32(version1, 4, 0x00010000);
    const struct {
        Bytes file;
        int result;
    } cases[] = {{version1, -1}, {PlainAppleDouble(kInfo, {}, 3), -5}, {Ascii("short"), -5}};
    for (const auto& [file, result] : cases) {
        Restart();
        Put(SrcResource(), file);
        Put(SrcStream(), AttributesOnly().Build());
        EXPECT_EQ(result, Copy(1));
        EXPECT_EQ(Line("Failed to copy " + SrcResource() + " to " + DstDouble() +
                       ", reason = " + std::to_string(result) + "."),
                  TakeLines().back());
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
        EXPECT_FALSE(Exists(DstDouble()));
        ExpectNothingHeld();
    }
    Restart();
    PutLoop(SrcResource());
    EXPECT_EQ(-2, Copy(0));
}

TEST_F(ToDoubleTest, ANameThatIsTooLongGivesMinus3AndALineForTheDestination) {
    PutAll();
    dst_ = to_ + "/" + std::string(254, 'n');
    EXPECT_EQ(-3, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(Line("filename too long: [" + dst_ + "].")));
    EXPECT_THAT(Codes("ea_adpath"), ElementsAre(0xC300));
    EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
}

TEST_F(ToDoubleTest, AnyOtherFailureOfAPathIsLoggedAndGivesMinus1) {
    PutAll();
    EXPECT_EQ(-1, EACopyToADFS("", dst_.c_str(), 1));
    EXPECT_THAT(TakeLines(), ElementsAre(StartsWith("ea_copy.c:LINE ")));
    EXPECT_EQ(-1, EACopyToADFS(src_.c_str(), nullptr, 1));
    EXPECT_THAT(TakeLines(), ElementsAre(StartsWith("ea_copy.c:LINE ")));
    // Of the source's paths a too long one is no reason for -3.
    const std::string long_src = from_ + std::string(4075 - from_.size() - 1, '/') + "a";
    EXPECT_EQ(-1, EACopyToADFS(long_src.c_str(), dst_.c_str(), 1));
    EXPECT_FALSE(Exists(DstDouble()));
}

TEST_F(ToDoubleTest, AResourceFileThatCannotBeRemovedFailsWith0x2A00BeforeTheAttributes) {
    PutAll();
    const FailCall fault("unlink", EACCES);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_copy.c")));
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstDouble()));
    EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
}

TEST_F(ToDoubleTest, AStreamThatCannotBeRemovedFailsWith0x2A00) {
    PutAll();
    const FailCall fault("unlink", EACCES, 2);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_copy.c")));
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_EQ(Whole().Build(), Content(DstDouble()));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
}

TEST_F(ToDoubleTest, AStreamThatCannotBeOpenedFailsWith0x900BehindTheResourceFile) {
    for (const int move : {0, 1}) {
        Restart();
        PutResource();
        PutLoop(SrcStream());
        EXPECT_EQ(-1, Copy(move));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_copy.c")));
        EXPECT_THAT(TakeLines(),
                    ElementsAre(Quoting("0x0900 ea_copy.c",
                                        "Failed to cp " + Pair() + ". " + strerror(ELOOP))));
        EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(DstDouble()));
        EXPECT_EQ(move == 0, Exists(SrcResource()));
        EXPECT_TRUE(Exists(SrcStream()));
    }
}

TEST_F(ToDoubleTest, AStreamThatIsNoneFailsAndStays) {
    PutResource();
    Bytes stream = AttributesOnly().Build();
    stream.resize(100);
    Put(SrcStream(), stream);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(AllOf(StartsWith(Line("[0x0A00 ")),
                                               HasSubstr("]Failed to cp " + Pair() + ". "))));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
    ExpectNothingHeld();
}

TEST_F(ToDoubleTest, ADoubleThatCannotBeOpenedForAttributesFailsAndTheStreamStays) {
    PutAll();
    PutLoop(DstDouble());
    Platform().fat_replace = [this](const std::string&) { return to_ + "/._safe"; };
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_copy.c")));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("0x0900 ea_copy.c", "Failed to cp " + Pair() +
                                                                         ". " + strerror(ELOOP))));
    EXPECT_EQ(Rewritten(kInfo, kForkBytes), Content(to_ + "/._safe"));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
    ExpectNothingHeld();
}

TEST_F(ToDoubleTest, AnAttributeThatCannotBeReadFailsAndTheStreamStays) {
    PutResource();
    Bytes stream = AttributesOnly().Build();
    PutU32(stream, AttributesOnly().RecordAt(1), 0x7FFFFFF0);
    Put(SrcStream(), stream);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(AllOf(StartsWith(Line("[0x0A00 ")),
                                               HasSubstr("]Failed to cp " + Pair() + ". "))));
    StreamImage expected = Whole();
    expected.attributes.pop_back();
    EXPECT_EQ(expected.Build(), Content(DstDouble()));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
}

TEST_F(ToDoubleTest, ADoubleThatAnotherProcessHasTakesNoAttributes) {
    Put(SrcStream(), AttributesOnly().Build());
    Put(DstDouble(), {});
    const OtherProcess other(DstDouble(), F_RDLCK);
    ASSERT_EQ(0, other.code());
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(AllOf(StartsWith(Line("[0x0400 ")),
                                               HasSubstr("]Failed to cp " + Pair() + ". "))));
    EXPECT_TRUE(Exists(SrcStream()));
}

TEST_F(ToDoubleTest, WhateverFailsNothingIsLostAndNothingLeaks) {
    for (const int move : {0, 1}) {
        for (int nth = 1;; ++nth) {
            ASSERT_LT(nth, 500);
            Restart();
            PutAll();
            const FailNthCall fault(nth, EIO);
            const int result = Copy(move);
            ExpectNothingHeld();
            if (!fault.fired()) {
                EXPECT_EQ(0, result);
                break;
            }
            SCOPED_TRACE(fault.name() + " " + std::to_string(nth));
            EXPECT_LE(result, 0);
            EXPECT_TRUE(result != 0 || Content(DstDouble()) == Whole().Build());
            EXPECT_TRUE(Exists(SrcResource()) || Content(DstDouble()).size() >= 82 + 20'000);
            EXPECT_TRUE(move != 0 || NamesIn(EADir(from_)).size() == 2);
        }
    }
}

// ---- File-EA volume to "._" file ------------------------------------------------------------

class FileEAToDoubleTest : public ToDoubleTest {
 protected:
    int CopyFileEA(int move) const {
        return EACopyFileEAFSToADFS(src_.c_str(), dst_.c_str(), move);
    }
    static Bytes RecordsInfo() { return Pattern(32, 0x40); }
};

// Promise: "Copying: The source is changed"
TEST_F(FileEAToDoubleTest, TheRecordsFinderInfoIsTheOneThatIsCopied) {
    for (const int move : {0, 1, 2}) {
        Restart();
        PutAll();
        SetAttribute(src_, kRecord, AttributeRecord());
        SetAttribute(src_, kFlushTime, Hex("00 00 00 01"));
        EXPECT_EQ(0, CopyFileEA(move));
        StreamImage expected = Whole();
        expected.finder_info = RecordsInfo();
        EXPECT_EQ(expected.Build(), Content(DstDouble()));
        EXPECT_EQ(move == 0 ? 2u : 0u, NamesIn(EADir(from_)).size());
        EXPECT_EQ(move == 0, AttributesOf(src_).contains(kRecord));
        EXPECT_TRUE(AttributesOf(src_).contains(kFlushTime));
        EXPECT_THAT(TakePlatformCalls(), Not(Contains(AnyOf("MAVOGetFSType(" + src_ + ", 1)",
                                                            "MAVOGetFSType(" + dst_ + ", 1)"))));
        ExpectNothingReported();
        ExpectNothingHeld();
    }
}

TEST_F(FileEAToDoubleTest, ARecordAloneMakesADouble) {
    SetAttribute(src_, kRecord, AttributeRecord());
    EXPECT_EQ(0, CopyFileEA(1));
    const Bytes file = Content(DstDouble());
    ASSERT_LE(82u, file.size());
    EXPECT_EQ(RecordsInfo(), Bytes(file.begin() + 50, file.begin() + 82));
}

TEST_F(FileEAToDoubleTest, WithoutARecordTheResourceFileIsCopiedAsItIs) {
    for (const int move : {0, 1}) {
        Restart();
        PutAll();
        EXPECT_EQ(0, CopyFileEA(move));
        EXPECT_EQ(Whole().Build(), Content(DstDouble()));
        ExpectNothingReported();
    }
}

TEST_F(FileEAToDoubleTest, WithARecordThatHasNoFinderInfoTheResourceFileIsCopiedAsItIs) {
    Bytes record = AttributeRecord();
    PutU32(record, 26 + 8, 31);  // too short
    for (const int move : {0, 1}) {
        Restart();
        PutAll();
        SetAttribute(src_, kRecord, record);
        const Bytes resource = Content(SrcResource());
        EXPECT_EQ(0, CopyFileEA(move));
        EXPECT_EQ(Whole().Build(), Content(DstDouble()));
        if (move == 0) {
            EXPECT_EQ(resource, Content(SrcResource()));
        }
        ExpectNothingReported();
    }
}

TEST_F(FileEAToDoubleTest, ARecordThatCannotBeReadIsLoggedAndNothingCopied) {
    PutAll();
    SetAttribute(src_, kRecord, Ascii("not one"));
    EXPECT_EQ(-1, CopyFileEA(1));
    EXPECT_THAT(TakeLines().back(), AllOf(StartsWith(Line("[0x0A00 ")),
                                          HasSubstr("]Failed file sync " + Pair() + ". ")));
    EXPECT_FALSE(Exists(DstDouble()));
    EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
    EXPECT_TRUE(AttributesOf(src_).contains(kRecord));
}

TEST_F(FileEAToDoubleTest, EveryFailureOfTheCopyIsLoggedAndBecomesMinus1) {
    PutAll();
    SetAttribute(src_, kRecord, AttributeRecord());
    const std::string dst = to_ + "/" + std::string(254, 'n');
    EXPECT_EQ(-1, EACopyFileEAFSToADFS(src_.c_str(), dst.c_str(), 1));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Line("filename too long: [" + dst + "]."),
                            StartsWith(Quoting("0xC300 ea_adpath",
                                               "Failed to cp [" + src_ + "]->[" + dst + "]. "))));
    EXPECT_TRUE(AttributesOf(src_).contains(kRecord));

    const WorkingDirectory here(to_);
    EXPECT_EQ(-1, EACopyFileEAFSToADFS(src_.c_str(), "Icon\r", 1));
    EXPECT_THAT(TakeLines().back(), HasSubstr("]Failed to cp [" + src_ + "]->[Icon\r]. "));
    EXPECT_TRUE(AttributesOf(src_).contains(kRecord));
}

TEST_F(FileEAToDoubleTest, ARecordThatIsGoneAlreadyIsAsGoodAsRemoved) {
    for (const int error : {ENODATA, ENOENT}) {
        Restart();
        PutAll();
        const FailCall fault("removexattr", error);
        EXPECT_EQ(0, CopyFileEA(1));
        EXPECT_TRUE(fault.fired());
        ExpectNothingReported();
    }
}

TEST_F(FileEAToDoubleTest, ARecordThatCannotBeRemovedIsLogged) {
    PutAll();
    const FailCall fault("removexattr", EPERM);
    EXPECT_EQ(-1, CopyFileEA(2));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting(
                                 "none", "remove xattr from [" + src_ + "] " + strerror(EPERM))));
    EXPECT_EQ(Whole().Build(), Content(DstDouble()));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
}

// ---- EA directory to file-EA volume ---------------------------------------------------------

class EADirToFileEATest : public AppleDoubleTest, public ::testing::WithParamInterface<bool> {
 protected:
    static CopyFn Function() { return GetParam() ? &CopyFnOfTest : nullptr; }
    int Copy(int move) const {
        return EACopyEADirFSToFileEAFS(src_.c_str(), dst_.c_str(), move, Function());
    }

    // A resource file that is not as the rewritten one, and a stream that is no stream.
    void PutAll() const {
        Put(SrcResource(), PlainAppleDouble(kInfo, kForkBytes, 13));
        Put(SrcStream(), Ascii("stream"));
    }
    static Bytes Expected() { return Rewritten(kInfo, kForkBytes, Repeat(0, 16)); }

    void ExpectResourceAloneMoved() const {
        EXPECT_EQ(Expected(), Content(DstResource()));
        EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
    }
};

INSTANTIATE_TEST_SUITE_P(By, EADirToFileEATest, ::testing::Bool(),
                         [](const auto& by) { return by.param ? "CopyFn" : "Program"; });

TEST_P(EADirToFileEATest, TheResourceFileIsRewrittenTheStreamCopiedAndTheRecordMade) {
    for (const int move : {0, 1, 2}) {
        Restart();
        PutAll();
        EXPECT_EQ(0, Copy(move));
        EXPECT_EQ(Expected(), Content(DstResource()));
        EXPECT_EQ(Ascii("stream"), Content(DstStream()));
        EXPECT_EQ(0777, ModeOf(DstResource()));
        EXPECT_EQ(0777, ModeOf(DstStream()));
        ExpectFileEA(kInfo);
        EXPECT_EQ(move == 0 ? 2u : 0u, NamesIn(EADir(from_)).size());
        if (GetParam()) {
            EXPECT_THAT(CallsOfCopyFn(), ElementsAre(SrcStream() + " -> " + DstStream()));
            EXPECT_THAT(TakePrograms(), IsEmpty());
        } else {
            EXPECT_THAT(TakePrograms(), ElementsAre("MLIBCExec(/bin/cp, -f, " + SrcStream() + ", " +
                                                    DstStream() + ")"));
        }
        ExpectNothingReported();
        ExpectNothingHeld();
    }
}

TEST_P(EADirToFileEATest, WithoutAResourceFileTheStreamIsNotCopiedEither) {
    for (const int move : {0, 1}) {
        Restart();
        Put(SrcStream(), Ascii("stream"));
        EXPECT_EQ(0, Copy(move));
        EXPECT_FALSE(Exists(EADir(to_)));
        EXPECT_TRUE(Exists(SrcStream()));
        EXPECT_THAT(AttributesOf(dst_), IsEmpty());
        ExpectNothingReported();
    }
}

TEST_P(EADirToFileEATest, AResourceFileAloneIsEnough) {
    Put(SrcResource(), Rewritten(kInfo, {}));
    EXPECT_EQ(0, Copy(1));
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoResource"));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
    ExpectFileEA(kInfo);
}

TEST_P(EADirToFileEATest, AnEADirectoryThatExistsKeepsItsOtherFiles) {
    PutAll();
    Put(EADir(to_) + "/other", Ascii("other"));
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ(Ascii("other"), Content(EADir(to_) + "/other"));
}

TEST_P(EADirToFileEATest, PathsThatCannotBeBuiltAreLogged) {
    PutAll();
    const std::string long_src = from_ + std::string(4075 - from_.size() - 1, '/') + "a";
    const std::string long_dst = to_ + std::string(4075 - to_.size() - 1, '/') + "b";
    for (const std::string& src : {std::string(), long_src}) {
        EXPECT_EQ(-1, EACopyEADirFSToFileEAFS(src.c_str(), dst_.c_str(), 1, Function()));
        EXPECT_THAT(TakeLines(), ElementsAre(Line("Fail to generate path of " + src + ".")));
    }
    for (const std::string& dst : {std::string(), long_dst, to_ + "/missing/b"}) {
        EXPECT_EQ(-1, EACopyEADirFSToFileEAFS(src_.c_str(), dst.c_str(), 1, Function()));
        EXPECT_EQ(Line("Fail to generate path of " + dst + "."), TakeLines().back());
    }
    EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
    EXPECT_THAT(AttributesOf(dst_), IsEmpty());
}

TEST_P(EADirToFileEATest, AResourceFileThatCannotBeRewrittenIsLoggedAndEndsIt) {
    Bytes version1 = Rewritten(kInfo, {});
    PutU32(version1, 4, 0x00010000);
    const struct {
        Bytes file;
        int reason;
    } cases[] = {{version1, -1}, {PlainAppleDouble(kInfo, {}, 3), -5}};
    for (const auto& [file, reason] : cases) {
        Restart();
        Put(SrcResource(), file);
        Put(SrcStream(), Ascii("stream"));
        EXPECT_EQ(-1, Copy(1));
        EXPECT_EQ(Line("Failed to copy " + SrcResource() + " to " + DstResource() +
                       ", reason = " + std::to_string(reason) + "."),
                  TakeLines().back());
        EXPECT_THAT(NamesIn(EADir(to_)), IsEmpty());
        EXPECT_EQ(2u, NamesIn(EADir(from_)).size());
        EXPECT_THAT(AttributesOf(dst_), IsEmpty());
    }
}

TEST_P(EADirToFileEATest, AResourceFileThatCannotBeRemovedIsLoggedAndEndsIt) {
    PutAll();
    const FailCall fault("unlink", EACCES);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("none", "Failed to remove [" + SrcResource() +
                                                             "]. Permission denied")));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(Expected(), Content(DstResource()));
    EXPECT_FALSE(Exists(DstStream()));
    EXPECT_THAT(AttributesOf(dst_), IsEmpty());
}

TEST_P(EADirToFileEATest, AResourceFileThatIsGoneAlreadyIsAsGoodAsRemoved) {
    PutAll();
    const FailCall fault("unlink", ENOENT);
    EXPECT_EQ(0, Copy(1));
    EXPECT_EQ(Ascii("stream"), Content(DstStream()));
    ExpectNothingReported();
}

TEST_P(EADirToFileEATest, AStreamThatCannotBeCopiedIsLoggedAndNoRecordMade) {
    PutAll();
    CopyFnAnswer() = [] {
        errno = EIO;
        return -1;
    };
    AnswerOfPrograms(-1, EIO);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Quoting("none", "Failed to cp -f " + SrcStream() + " " + DstStream() +
                                                ". " + strerror(EIO)),
                            Quoting("none", "Failed to cp " + Pair() + ". " + strerror(EIO))));
    ExpectResourceAloneMoved();
    EXPECT_THAT(AttributesOf(dst_), IsEmpty());
}

TEST_P(EADirToFileEATest, AStreamThatCannotBeRemovedIsLoggedAndNoRecordMade) {
    PutAll();
    const FailCall fault("unlink", EACCES, 2);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(Codes(), ElementsAre(0x2A00));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("0x2A00 ea_copy.c", "Failed to cp " + Pair() +
                                                                         ". Permission denied")));
    ExpectResourceAloneMoved();
    EXPECT_THAT(AttributesOf(dst_), IsEmpty());
}

TEST_P(EADirToFileEATest, AFailedSyncIsLoggedByTheOtherDirectionsText) {
    PutAll();
    RefuseToSet(kRecord);
    EXPECT_EQ(-1, Copy(0));
    EXPECT_THAT(TakeLines().back(), AllOf(StartsWith("ea_copy.c:LINE ["),
                                          HasSubstr("]Failed file sync " + Pair() + ". ")));
    EXPECT_EQ(Expected(), Content(DstResource()));
    EXPECT_EQ(Ascii("stream"), Content(DstStream()));
}

TEST_P(EADirToFileEATest, AFailedFlushTimeIsLogged) {
    PutAll();
    RefuseToSet(kFlushTime, 2);  // the sync sets it once itself
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeLines().back(), AllOf(StartsWith("ea_copy.c:LINE [0x2A00 "),
                                          HasSubstr("]Failed ea write time " + Pair() + ". ")));
    ExpectFileEA(kInfo);
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
}

TEST_P(EADirToFileEATest, WhateverFailsNothingIsLostAndNothingLeaks) {
    for (const int move : {0, 1}) {
        for (int nth = 1;; ++nth) {
            ASSERT_LT(nth, 500);
            Restart();
            PutAll();
            const FailNthCall fault(nth, EIO);
            const int result = Copy(move);
            ExpectNothingHeld();
            if (!fault.fired()) {
                EXPECT_EQ(0, result);
                break;
            }
            SCOPED_TRACE(fault.name() + " " + std::to_string(nth));
            EXPECT_TRUE(result == 0 || result == -1) << result;
            if (WentOnWithDefaults()) continue;
            EXPECT_TRUE(Exists(SrcResource()) || Content(DstResource()) == Expected());
            EXPECT_TRUE(Exists(SrcStream()) || Content(DstStream()) == Ascii("stream"));
            EXPECT_TRUE(move != 0 || NamesIn(EADir(from_)).size() == 2);
        }
    }
}

}  // namespace
}  // namespace mavoea::test

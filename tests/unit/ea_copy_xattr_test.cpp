// Copying streams and resource files from EA directory to EA directory, into real extended
// attributes, and back.

#include <fcntl.h>

#include <algorithm>
#include <string>
#include <vector>

#include "ops/ea_copy.h"
#include "tests/support/copy_fixture.h"
#include "tests/support/stream_fixture.h"
#include "util/growing_buffer.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;

constexpr char kFinderInfo[] = "com.apple.FinderInfo";
constexpr char kFork[] = "com.apple.ResourceFork";

const Bytes kInfo = Pattern(32, 3);
const Bytes kForkBytes = Pattern(1500, 5);
const Bytes kShortFork = Pattern(700, 6);  // fits the buffer at first

Bytes Be32(std::size_t value) {
    Bytes bytes(4);
    PutU32(bytes, 0, value);
    return bytes;
}

// The 84 bytes that begin every resource file that is made of attributes.
Bytes ResourceHead(std::size_t fork_length) {
    return Hex("00 05 16 07  00 02 00 00 "
               "'MAVONICS' 20*8 "
               "00 02 "
               "00 00 00 09  00 00 00 32  00 00 00 20 "  // Finder info at 50, 32 bytes
               "00 00 00 02  00 00 00 52") +             // resource fork at 82
           Be32(fork_length) +
           Repeat(0, 34);
}

// A whole resource file of that layout.
Bytes ResourceFile(const Bytes& finder_info, const Bytes& fork) {
    Bytes file = ResourceHead(fork.size());
    file.resize(50);
    return file + finder_info + fork;
}

// The classic header of netatalk: 741 bytes with 13 entries, then the fork.
Bytes NetatalkResourceFile(const Bytes& finder_info, const Bytes& fork) {
    Bytes file =
        Hex("00 05 16 07  00 02 00 00  'Netatalk' 20*8  00 0D "
            "00 00 00 02  00 00 02 E5  00 00 00 00 "   // resource fork, 741
            "00 00 00 03  00 00 00 B6  00 00 00 00 "   // name, 182
            "00 00 00 04  00 00 01 B5  00 00 00 00 "   // comment, 437
            "00 00 00 08  00 00 02 7D  00 00 00 10 "   // file dates, 637
            "00 00 00 09  00 00 02 8D  00 00 00 20 "   // Finder info, 653
            "00 00 00 0E  00 00 02 AD  00 00 00 04 "   // AFP file info, 685
            "00 00 00 0D  00 00 02 B1  00 00 00 00 "   // short name, 689
            "00 00 00 07  00 00 02 BD  00 00 00 08 "   // ProDOS file info, 701
            "80 44 45 56  00 00 02 C5  00 00 00 08 "   // private device, 709
            "80 49 4E 4F  00 00 02 CD  00 00 00 08 "   // private inode, 717
            "80 53 59 4E  00 00 02 D5  00 00 00 08 "   // private sync, 725
            "80 53 56 7E  00 00 02 DD  00 00 00 04 "   // private id, 733
            "00 00 00 0F  00 00 02 E1  00 00 00 04");  // directory id, 737
    PutU32(file, 34, fork.size());
    file.resize(653);
    file = file + finder_info;
    file.resize(741);
    return file + fork;
}

// `directory`/`name`, with as many slashes between as make it `length` bytes.
std::string PathOf(const std::string& directory, const std::string& name, std::size_t length) {
    return directory + std::string(length - directory.size() - name.size(), '/') + name;
}

// The longest path whose metadata files have one that fits, and the one that only opening takes.
constexpr std::size_t kLongestPath = 4074;
constexpr std::size_t kTooLongPath = 4075;

// ---- The buffer -----------------------------------------------------------------------------

TEST(GrowingBufferTest, HasRoomFor1024BytesAtFirstAndAllocatesOnlyForMore) {
    ResetKernel();
    const GrowingBuffer at_first;
    EXPECT_EQ(1024u, at_first.size());
    EXPECT_EQ(1024u, TakeAllocations().total);
    GrowingBuffer buffer;
    TakeAllocations();
    EXPECT_TRUE(buffer.Reach(0));
    EXPECT_TRUE(buffer.Reach(1024));
    EXPECT_EQ(0u, TakeAllocations().total);
    EXPECT_TRUE(buffer.Reach(1025));
    EXPECT_EQ(1025u, TakeAllocations().total);
    EXPECT_EQ(1025u, buffer.size());
    EXPECT_TRUE(buffer.Reach(10));
    EXPECT_EQ(1025u, buffer.size());
}

TEST(GrowingBufferTest, HasNoRoomLeftOnceGrowingFailedAndFindsItAgain) {
    ResetKernel();
    const int live = TakeAllocations().live;
    {
        GrowingBuffer buffer;
        {
            const FailCall fault("malloc", ENOMEM);
            EXPECT_FALSE(buffer.Reach(5000));
        }
        EXPECT_EQ(0u, buffer.size());
        EXPECT_EQ(live, TakeAllocations().live);
        EXPECT_TRUE(buffer.Reach(1));
        EXPECT_EQ(1u, buffer.size());
    }
    EXPECT_EQ(live, TakeAllocations().live);
}

// ---- One file of an EA directory ------------------------------------------------------------

// With the caller's function and without.
class SidecarTest : public CopyTest, public ::testing::WithParamInterface<bool> {
 protected:
    static CopyFn Function() { return GetParam() ? &CopyFnOfTest : nullptr; }

    int Copy(int move, const char* name = "MavoResource") const {
        return EACopySidecar(src_.c_str(), dst_.c_str(), name, move, Function());
    }
    int CopyBoth(int move) const {
        return EACopyEADirFSToEADirFS(src_.c_str(), dst_.c_str(), move, Function());
    }

    // The copies made since the last time, as "from -> to".
    static std::vector<std::string> TakeCopies() {
        std::vector<std::string> copies = std::exchange(CallsOfCopyFn(), {});
        const std::string kBegin = "MLIBCExec(/bin/cp, -f, ";
        for (const std::string& call : TakePlatformCalls()) {
            if (!call.starts_with("MLIBCExec")) continue;
            EXPECT_FALSE(GetParam()) << call;
            EXPECT_THAT(call, StartsWith(kBegin));
            const auto comma = call.find(", ", kBegin.size());
            copies.push_back(call.substr(kBegin.size(), comma - kBegin.size()) + " -> " +
                             call.substr(comma + 2, call.size() - comma - 3));
        }
        return copies;
    }

    // Every copy gives `result`, with errno, and copies nothing.
    static void Answer(int result, int error) {
        CopyFnAnswer() = [=] {
            errno = error;
            return result;
        };
        Platform().exec = [=](const std::vector<std::string>&) {
            errno = error;
            return result;
        };
    }
};

INSTANTIATE_TEST_SUITE_P(By, SidecarTest, ::testing::Bool(),
                         [](const auto& by) { return by.param ? "CopyFn" : "Program"; });

TEST_P(SidecarTest, ASourceWithoutTheFileLeavesTheDestinationUntouched) {
    for (const int move : {0, 1, 2}) {
        Reset();
        Put(SrcStream(), Ascii("another kind"));
        EXPECT_EQ(0, Copy(move));
        EXPECT_FALSE(Exists(EADir(to_)));
        EXPECT_THAT(TakeCopies(), IsEmpty());
        EXPECT_TRUE(Exists(SrcStream()));
        ExpectNothingReported();
    }
}

TEST_P(SidecarTest, TheFileIsCopiedAndOpenedToEveryone) {
    Put(SrcResource(), Pattern(70'000));
    ASSERT_EQ(0, chmod(SrcResource().c_str(), 0600));
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ(Pattern(70'000), Content(DstResource()));
    EXPECT_EQ(0777, ModeOf(DstResource()));
    EXPECT_EQ(0777, ModeOf(EADir(to_)));
    EXPECT_EQ(Pattern(70'000), Content(SrcResource()));
    EXPECT_THAT(TakeCopies(), ElementsAre(SrcResource() + " -> " + DstResource()));
    ExpectNothingReported();
}

TEST_P(SidecarTest, EitherKindIsCopied) {
    Put(SrcStream(), Pattern(100));
    EXPECT_EQ(0, Copy(0, "MavoEAStream"));
    EXPECT_EQ(Pattern(100), Content(DstStream()));
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoEAStream"));
}

TEST_P(SidecarTest, AMoveRemovesTheSourcesFile) {
    for (const int move : {1, 2}) {
        Reset();
        Put(SrcResource(), Ascii("resource"));
        Put(SrcStream(), Ascii("stream"));
        EXPECT_EQ(0, Copy(move));
        EXPECT_EQ(Ascii("resource"), Content(DstResource()));
        EXPECT_EQ(0777, ModeOf(DstResource()));
        EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
        ExpectNothingReported();
    }
}

TEST_P(SidecarTest, AnEADirectoryThatExistsKeepsItsOtherFilesAndTheOldOneIsReplaced) {
    Put(SrcResource(), Ascii("new"));
    Put(DstResource(), Ascii("old and longer"));
    Put(EADir(to_) + "/other", Ascii("other"));
    EXPECT_EQ(0, Copy(0));
    EXPECT_EQ(Ascii("new"), Content(DstResource()));
    EXPECT_EQ(Ascii("other"), Content(EADir(to_) + "/other"));
}

TEST_P(SidecarTest, NamesWithAnyBytesAreCopied) {
    for (const std::string name :
         {"two words", "it's \"quoted\"", "new\nline", "$(x);`y`", "-f", "\xC3\xA4\xFF", "%s%n"}) {
        SCOPED_TRACE(name);
        Reset();
        Put(EADir(from_) + "/" + name + "@MavoResource", Ascii(name));
        EXPECT_EQ(0, EACopySidecar((from_ + "/" + name).c_str(), (to_ + "/" + name).c_str(),
                                   "MavoResource", 1, Function()));
        EXPECT_EQ(Ascii(name), Content(EADir(to_) + "/" + name + "@MavoResource"));
        EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
    }
}

TEST_P(SidecarTest, LongNamesAreShortenedOnBothSides) {
    // 250 bytes: the last 9 sum up to 1080, a multiple of 60, whose check character is "1".
    const std::string name(250, 'x');
    const std::string stored = std::string(241, 'x') + "1@MavoResource";
    Put(EADir(from_) + "/" + stored, Ascii("long"));
    EXPECT_EQ(0, EACopySidecar((from_ + "/" + name).c_str(), (to_ + "/" + name).c_str(),
                               "MavoResource", 1, Function()));
    EXPECT_EQ(Ascii("long"), Content(EADir(to_) + "/" + stored));
    EXPECT_FALSE(Exists(EADir(from_) + "/" + stored));
}

TEST_P(SidecarTest, APathThatCannotBeBuiltFailsBeforeAnythingIsMade) {
    Put(SrcResource(), Ascii("resource"));
    const std::string long_src = PathOf(from_, "a", kTooLongPath);
    const std::string long_dst = PathOf(to_, "b", kTooLongPath);
    const std::string pairs[][2] = {{"", dst_}, {src_, ""}, {long_src, dst_}, {src_, long_dst}};
    for (const auto& [src, dst] : pairs) {
        EXPECT_EQ(-1, EACopySidecar(src.c_str(), dst.c_str(), "MavoResource", 1, Function()));
        EXPECT_THAT(TakeCopies(), IsEmpty());
        EXPECT_FALSE(Exists(EADir(to_)));
        EXPECT_TRUE(Exists(SrcResource()));
        EXPECT_THAT(Codes(), IsEmpty());
    }
    EXPECT_EQ(0,
              EACopySidecar(PathOf(from_, "a", kLongestPath).c_str(),
                            PathOf(to_, "b", kLongestPath).c_str(), "MavoResource", 1, Function()));
    EXPECT_EQ(Ascii("resource"), Content(DstResource()));
}

TEST_P(SidecarTest, ADestinationWhoseDirectoryIsMissingFails) {
    Put(SrcResource(), Ascii("resource"));
    const std::string dst = to_ + "/missing/b";
    EXPECT_EQ(-1, EACopySidecar(src_.c_str(), dst.c_str(), "MavoResource", 1, Function()));
    EXPECT_THAT(TakeCopies(), IsEmpty());
    EXPECT_TRUE(Exists(SrcResource()));
}

TEST_P(SidecarTest, AFailedCopyIsLoggedAndTheSourceStays) {
    Put(SrcResource(), Ascii("resource"));
    for (const int move : {0, 1, 2}) {
        Answer(-1, EIO);
        EXPECT_EQ(-1, Copy(move));
        EXPECT_THAT(TakeLines(),
                    ElementsAre(Quoting("none", "Failed to cp -f " + SrcResource() + " " +
                                                    DstResource() + ". Input/output error")));
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_TRUE(Exists(SrcResource()));
        EXPECT_THAT(NamesIn(EADir(to_)), IsEmpty());
    }
}

TEST_P(SidecarTest, OnlyANegativeResultIsAFailedCopy) {
    Put(SrcResource(), Ascii("resource"));
    Put(DstResource(), Ascii("as it was"));
    Answer(1, EIO);
    EXPECT_EQ(0, Copy(1));
    EXPECT_FALSE(Exists(SrcResource()));
    EXPECT_EQ(0777, ModeOf(DstResource()));
    ExpectNothingReported();
}

TEST_P(SidecarTest, ASourceThatCannotBeRemovedFailsWith0x2A00AndTheCopyStays) {
    const Umask mask(022);
    Put(SrcResource(), Ascii("resource"));
    const FailCall fault("unlink", EACCES);
    EXPECT_EQ(-1, Copy(1));
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_copy.c")));
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_EQ(Ascii("resource"), Content(DstResource()));
    EXPECT_EQ(0644, ModeOf(DstResource()));  // not opened to everyone any more
}

TEST_P(SidecarTest, ASourceThatIsGoneAlreadyIsAsGoodAsRemoved) {
    Put(SrcResource(), Ascii("resource"));
    const FailCall fault("unlink", ENOENT);
    EXPECT_EQ(0, Copy(1));
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ(0777, ModeOf(DstResource()));
    ExpectNothingReported();
}

TEST_P(SidecarTest, AModeThatCannotBeSetIsNoFailure) {
    Put(SrcResource(), Ascii("resource"));
    ASSERT_EQ(0, mkdir(EADir(to_).c_str(), 0777));
    const FailCall fault("fchmod", EPERM, 0);
    EXPECT_EQ(0, Copy(0));
    EXPECT_TRUE(fault.fired());
    ExpectNothingReported();
}

TEST_P(SidecarTest, BothFilesAreCopiedTheResourceFileFirst) {
    for (const int move : {0, 1, 2}) {
        Reset();
        Put(SrcResource(), Ascii("resource"));
        Put(SrcStream(), Ascii("stream"));
        EXPECT_EQ(0, CopyBoth(move));
        EXPECT_EQ(Ascii("resource"), Content(DstResource()));
        EXPECT_EQ(Ascii("stream"), Content(DstStream()));
        EXPECT_THAT(TakeCopies(), ElementsAre(SrcResource() + " -> " + DstResource(),
                                              SrcStream() + " -> " + DstStream()));
        EXPECT_EQ(move == 0 ? 2u : 0u, NamesIn(EADir(from_)).size());
        ExpectNothingReported();
    }
}

TEST_P(SidecarTest, WithoutMetadataThereIsNothingToDo) {
    EXPECT_EQ(0, CopyBoth(1));
    EXPECT_FALSE(Exists(EADir(to_)));
    ExpectNothingReported();
}

TEST_P(SidecarTest, TheStreamIsNotCopiedWhenTheResourceFileFailed) {
    Put(SrcResource(), Ascii("resource"));
    Put(SrcStream(), Ascii("stream"));
    Answer(-1, ENOSPC);
    EXPECT_EQ(-1, CopyBoth(1));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Quoting("none", "Failed to cp -f " + SrcResource() + " " +
                                                DstResource() + ". No space left on device"),
                            Quoting("none", "Failed to cp [" + src_ + "]->[" + dst_ +
                                                "]. No space left on device")));
    EXPECT_EQ(1u, TakeCopies().size());
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream", "a@MavoResource"));
}

TEST_P(SidecarTest, AFailureOfTheStreamLeavesTheResourceFileCarried) {
    Put(SrcResource(), Ascii("resource"));
    Put(SrcStream(), Ascii("stream"));
    const FailCall fault("unlink", EACCES, 2);
    EXPECT_EQ(-1, CopyBoth(1));
    EXPECT_THAT(Codes(), ElementsAre(0x2A00));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Quoting("0x2A00 ea_copy.c", "Failed to cp [" + src_ + "]->[" + dst_ +
                                                            "]. Permission denied")));
    EXPECT_EQ(Ascii("resource"), Content(DstResource()));
    EXPECT_EQ(Ascii("stream"), Content(DstStream()));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
}

TEST_P(SidecarTest, WhateverFailsNothingIsLostAndNothingLeaks) {
    for (const int move : {0, 1}) {
        for (int nth = 1;; ++nth) {
            ASSERT_LT(nth, 200);
            Reset();
            Put(SrcResource(), Ascii("resource"));
            Put(SrcStream(), Ascii("stream"));
            const FailNthCall fault(nth, EIO);
            const int result = CopyBoth(move);
            if (!fault.fired()) break;
            SCOPED_TRACE(fault.name() + " " + std::to_string(nth));
            EXPECT_TRUE(result == 0 || result == -1) << result;
            EXPECT_TRUE(Exists(SrcResource()) || Content(DstResource()) == Ascii("resource"));
            EXPECT_TRUE(Exists(SrcStream()) || Content(DstStream()) == Ascii("stream"));
            ExpectNothingHeld();
        }
    }
}

// ---- Removing the source's resource file ----------------------------------------------------

class RemoveSrcResourceTest : public CopyTest {};

TEST_F(RemoveSrcResourceTest, TheResourceFileAloneIsRemovedAndAMissingOneIsAsGood) {
    Put(SrcResource(), Ascii("resource"));
    Put(SrcStream(), Ascii("stream"));
    EXPECT_EQ(0, EARemoveSrcResource(src_.c_str()));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
    EXPECT_EQ(0, EARemoveSrcResource(src_.c_str()));
    ExpectNothingReported();
}

TEST_F(RemoveSrcResourceTest, AFileThatCannotBeRemovedFailsWith0x2A00) {
    Put(SrcResource(), Ascii("resource"));
    for (const int error : {EACCES, EBUSY, EIO, ENOTDIR}) {
        const FailCall fault("unlink", error);
        EXPECT_EQ(-1, EARemoveSrcResource(src_.c_str()));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_copy.c")));
        EXPECT_THAT(TakeLog(), IsEmpty());
    }
}

TEST_F(RemoveSrcResourceTest, APathThatCannotBeBuiltIsLogged) {
    EXPECT_EQ(-1, EARemoveSrcResource(""));
    EXPECT_THAT(TakeLines(), ElementsAre(Line("Fail to generate path of .")));
    EXPECT_THAT(Codes(), IsEmpty());
    const std::string path = PathOf(from_, "a", kTooLongPath);
    EXPECT_EQ(-1, EARemoveSrcResource(path.c_str()));
    EXPECT_THAT(TakeLines(), ElementsAre(Line("Fail to generate path of " + path + ".")));
    Put(SrcResource(), Ascii("resource"));
    EXPECT_EQ(0, EARemoveSrcResource(PathOf(from_, "a", kLongestPath).c_str()));
    EXPECT_FALSE(Exists(SrcResource()));
}

// ---- From stream and resource file to attributes --------------------------------------------

class ToXattrTest : public CopyTest {
 protected:
    int Copy(int move = 0, int place = EA_PLACE_EADIR) const {
        return EACopyEAStreamToXattr(src_.c_str(), dst_.c_str(), move, place);
    }

    // Three attributes in the stream, Finder info and fork in the resource file.
    void PutAll() const {
        Put(SrcStream(), ThreeAttributes().Build());
        Put(SrcResource(), ResourceFile(kInfo, kForkBytes));
    }
    static StreamImage ThreeAttributes() {
        return {.attributes = {{"user.one", Ascii("1")},
                               {"user.two", Pattern(2000, 2)},
                               {"user.three", Ascii("3")}}};
    }
    static Attributes All() {
        return {{"user.one", Ascii("1")},
                {"user.two", Pattern(2000, 2)},
                {"user.three", Ascii("3")},
                {kFinderInfo, kInfo},
                {kFork, kForkBytes}};
    }
    static Attributes Without(std::vector<std::string> names, Attributes all = All()) {
        for (const std::string& name : names) all.erase(name);
        return all;
    }

    // Makes the set of these attributes fail, of the fork's file too.
    static void RefuseToSet(const std::vector<std::string>& names) {
        const auto set = Hooks().setxattr;
        Hooks().setxattr = [=](const char* path, const char* name, const void* value, size_t size,
                               int flags) {
            if (std::find(names.begin(), names.end(), name) != names.end()) {
                errno = EPERM;
                return -1;
            }
            return set(path, name, value, size, flags);
        };
        if (std::find(names.begin(), names.end(), kFork) != names.end()) {
            Hooks().fopen = [](const char*, const char*) -> FILE* {
                errno = EPERM;
                return nullptr;
            };
        }
    }

    // The resource file is refused with that code, nothing of it is copied, and it stays.
    void ExpectRefused(const Bytes& resource, int code) {
        Reset();
        Put(SrcResource(), resource);
        TakeAllocations();
        EXPECT_EQ(-1, Copy(1));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, "ea_copy.c")));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_THAT(AttributesOf(dst_), IsEmpty());
        EXPECT_EQ(resource, Content(SrcResource()));
        EXPECT_LT(TakeAllocations().total, 100'000u);
        ExpectNothingHeld();
    }
};

TEST_F(ToXattrTest, ASourceWithoutMetadataCopiesNothing) {
    for (const int place : {0, 1}) {
        for (const int move : {0, 1, 2}) {
            EXPECT_EQ(0, Copy(move, place));
            EXPECT_THAT(AttributesOf(dst_), IsEmpty());
            EXPECT_FALSE(Exists(EADir(from_)));
            ExpectNothingReported();
        }
    }
}

TEST_F(ToXattrTest, EveryAttributeForkAndFinderInfoIsCopied) {
    PutAll();
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(All(), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream", "a@MavoResource"));
    EXPECT_FALSE(Exists(EADir(to_)));
    ExpectNothingReported();
    ExpectNothingHeld();
}

TEST_F(ToXattrTest, AttributesAreSetInTableOrderThenForkThenFinderInfoWithFlags0) {
    PutAll();
    TakeCalls();
    EXPECT_EQ(0, Copy());
    std::vector<std::string> calls = TakeCalls();
    std::erase_if(calls, [](const std::string& call) {
        return !call.starts_with("setxattr(") && !call.starts_with("fwrite(");
    });
    EXPECT_THAT(calls, ElementsAre("setxattr(" + dst_ + ", user.one, 1, 0)",
                                   "setxattr(" + dst_ + ", user.two, 2000, 0)",
                                   "setxattr(" + dst_ + ", user.three, 1, 0)", "fwrite(1500)",
                                   "setxattr(" + dst_ + ", com.apple.FinderInfo, 32, 0)"));
}

TEST_F(ToXattrTest, WhatTheDestinationHasIsReplacedAndTheRestOfItStays) {
    PutAll();
    SetAttribute(dst_, "user.one", Ascii("former"));
    SetAttribute(dst_, "user.other", Ascii("other"));
    SetAttribute(dst_, kFork, Pattern(3000));
    EXPECT_EQ(0, Copy());
    Attributes expected = All();
    expected["user.other"] = Ascii("other");
    EXPECT_EQ(expected, AttributesOf(dst_));
}

TEST_F(ToXattrTest, AMoveRemovesBothFiles) {
    for (const int move : {1, 2}) {
        Reset();
        PutAll();
        EXPECT_EQ(0, Copy(move));
        EXPECT_EQ(All(), AttributesOf(dst_));
        EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
        ExpectNothingReported();
    }
}

TEST_F(ToXattrTest, AStreamAloneAndAResourceFileAloneAreCopied) {
    Put(SrcStream(), ThreeAttributes().Build());
    EXPECT_EQ(0, Copy(1));
    EXPECT_EQ(Without({kFork, kFinderInfo}), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());

    Reset();
    Put(SrcResource(), ResourceFile(kInfo, kForkBytes));
    EXPECT_EQ(0, Copy(1));
    EXPECT_EQ((Attributes{{kFork, kForkBytes}, {kFinderInfo, kInfo}}), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
    ExpectNothingReported();
}

TEST_F(ToXattrTest, StreamsWithoutAttributesAndAttributesWithoutBytesAreNoFailure) {
    Put(SrcStream(), StreamImage{}.Build());
    EXPECT_EQ(0, Copy(1));
    EXPECT_FALSE(Exists(SrcStream()));

    Reset();
    Put(SrcStream(), {});
    EXPECT_EQ(0, Copy(1));
    EXPECT_FALSE(Exists(SrcStream()));

    Reset();
    Put(SrcStream(), StreamImage{.attributes = {{"user.empty", {}}}}.Build());
    EXPECT_EQ(0, Copy());
    EXPECT_EQ((Attributes{{"user.empty", {}}}), AttributesOf(dst_));
    ExpectNothingReported();
}

TEST_F(ToXattrTest, AnAttributeWithoutBytesMayLieAnywhere) {
    const StreamImage image{.attributes = {{"user.empty", {}}, {"user.one", Ascii("1")}}};
    Bytes file = image.Build();
    PutU32(file, image.RecordAt(0), 0x7FFFFFF0);
    Put(SrcStream(), file);
    EXPECT_EQ(0, Copy());
    EXPECT_EQ((Attributes{{"user.empty", {}}, {"user.one", Ascii("1")}}), AttributesOf(dst_));
    ExpectNothingReported();
}

TEST_F(ToXattrTest, TheAppleDoubleFileServesAsBothAndAMoveRemovesIt) {
    StreamImage image = ThreeAttributes();
    image.finder_info = kInfo;
    image.fork = kForkBytes;
    for (const int move : {0, 1, 2}) {
        Reset();
        Put(SrcDouble(), image.Build());
        Put(SrcStream(), Ascii("of another place"));
        EXPECT_EQ(0, Copy(move, EA_PLACE_APPLEDOUBLE));
        EXPECT_EQ(All(), AttributesOf(dst_));
        EXPECT_EQ(move == 0, Exists(SrcDouble()));
        EXPECT_TRUE(Exists(SrcStream()));
        ExpectNothingReported();
        ExpectNothingHeld();
    }
}

TEST_F(ToXattrTest, AMoveOfAnAppleDoubleFileRemovesItThoughAttributesFailed) {
    StreamImage image = ThreeAttributes();
    image.finder_info = kInfo;
    Put(SrcDouble(), image.Build());
    RefuseToSet({"user.one"});
    EXPECT_EQ(-2, Copy(1, EA_PLACE_APPLEDOUBLE));
    EXPECT_FALSE(Exists(SrcDouble()));
}

TEST_F(ToXattrTest, FailuresAreCountedAndTheOtherAttributesCopied) {
    const struct {
        std::vector<std::string> refused;
        int result;
    } cases[] = {{{"user.one"}, -2},
                 {{"user.two"}, -2},
                 {{"user.one", "user.three"}, -3},
                 {{"user.one", "user.two", "user.three"}, -4}};
    for (const auto& [refused, result] : cases) {
        Reset();
        PutAll();
        RefuseToSet(refused);
        EXPECT_EQ(result, Copy(1));
        EXPECT_EQ(std::vector<int>(refused.size(), 0xB00), Codes());
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_EQ(Without(refused), AttributesOf(dst_));
        // The stream stays, all of whose attributes are still needed; the resource file goes.
        EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
        ExpectNothingHeld();
    }
}

TEST_F(ToXattrTest, AFailureOfTheResourceFileDoesNotHideTheCountOfTheStream) {
    PutAll();
    RefuseToSet({"user.one", "user.two", kFinderInfo});
    EXPECT_EQ(-3, Copy());
    EXPECT_THAT(Codes(), ElementsAre(0xB00, 0xB00, 0xB00));
}

TEST_F(ToXattrTest, ValuesThatTheFileDoesNotHoldFailWith0xA00AndTakeNoMemory) {
    Bytes lying = ThreeAttributes().Build();
    const std::size_t record = ThreeAttributes().RecordAt(1);
    const std::uint32_t lies[][2] = {{0xFFFFFFF0, 0xFFFFFFF0},
                                     {0, 0xFFFFFFFF},
                                     {0xFFFFFFFF, 1},
                                     {ThreeAttributes().ValueAt(1), 2002},
                                     {ThreeAttributes().ValueAt(1), 0x7FFFFFFF}};
    for (const auto& [offset, length] : lies) {
        SCOPED_TRACE(offset);
        Reset();
        PutU32(lying, record, offset);
        PutU32(lying, record + 4, length);
        Put(SrcStream(), lying);
        TakeAllocations();
        EXPECT_EQ(-2, Copy(1));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_copy.c")));
        EXPECT_LT(TakeAllocations().largest, 100'000u);
        EXPECT_EQ(Without({"user.two", kFork, kFinderInfo}), AttributesOf(dst_));
        EXPECT_TRUE(Exists(SrcStream()));
    }
}

TEST_F(ToXattrTest, WithoutMemoryForTheBufferNothingIsDone) {
    PutAll();
    const FailCall fault("malloc", ENOMEM);
    TakeCallNames();
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x100, "ea_copy.c")));
    EXPECT_THAT(AttributesOf(dst_), IsEmpty());
    EXPECT_THAT(TakeCallNames(), Not(Contains("open")));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream", "a@MavoResource"));
    ExpectNothingHeld();
}

TEST_F(ToXattrTest, ABufferThatCannotGrowCostsThatAttributeAlone) {
    int seen = 0;
    for (int nth = 2;; ++nth) {
        ASSERT_LT(nth, 100);
        Reset();
        Put(SrcStream(), ThreeAttributes().Build());
        const FailCall fault("malloc", ENOMEM, nth);
        const int result = Copy(1);
        if (!fault.fired()) break;
        const std::vector<int> codes = Codes();
        ExpectNothingHeld();
        EXPECT_EQ(result != 0, Exists(SrcStream()));
        if (codes.empty()) continue;  // the stream itself could not be opened
        ++seen;
        EXPECT_THAT(codes, ElementsAre(0x100));
        EXPECT_EQ(-2, result);
        EXPECT_EQ(Without({"user.two", kFork, kFinderInfo}), AttributesOf(dst_));
    }
    EXPECT_EQ(1, seen);
}

TEST_F(ToXattrTest, ABufferThatCannotGrowForTheForkFailsWith0x100) {
    int seen = 0;
    for (int nth = 2;; ++nth) {
        ASSERT_LT(nth, 100);
        Reset();
        Put(SrcResource(), ResourceFile(kInfo, kForkBytes));
        const FailCall fault("malloc", ENOMEM, nth);
        const int result = Copy(1);
        if (!fault.fired()) break;
        ++seen;
        EXPECT_EQ(-1, result);
        EXPECT_THAT(Codes(), ElementsAre(0x100));
        EXPECT_THAT(AttributesOf(dst_), IsEmpty());
        EXPECT_TRUE(Exists(SrcResource()));
        ExpectNothingHeld();
    }
    EXPECT_EQ(1, seen);
}

TEST_F(ToXattrTest, AStreamThatCannotBeOpenedFailsWith0x900AndTheResourceFileIsCopied) {
    for (const int move : {0, 1}) {
        Reset();
        PutLoop(SrcStream());
        Put(SrcResource(), ResourceFile(kInfo, kForkBytes));
        EXPECT_EQ(-2, Copy(move));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_copy.c")));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_EQ((Attributes{{kFork, kForkBytes}, {kFinderInfo, kInfo}}), AttributesOf(dst_));
        EXPECT_TRUE(Exists(SrcStream()));
        EXPECT_EQ(move == 0, Exists(SrcResource()));
    }
}

TEST_F(ToXattrTest, AStreamThatIsNoneGivesMinus2AndTheResourceFileIsCopied) {
    Put(SrcStream(), Ascii("short"));
    Put(SrcResource(), ResourceFile(kInfo, {}));
    EXPECT_EQ(-2, Copy(1));
    EXPECT_THAT(Codes(), IsEmpty());
    EXPECT_EQ((Attributes{{kFinderInfo, kInfo}}), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream"));
    ExpectNothingHeld();
}

TEST_F(ToXattrTest, AStreamThatAnotherProcessWritesGivesMinus2) {
    PutAll();
    const OtherProcess writer(SrcStream(), F_WRLCK);
    ASSERT_EQ(0, writer.code());
    EXPECT_EQ(-2, Copy(1));
    EXPECT_EQ((Attributes{{kFork, kForkBytes}, {kFinderInfo, kInfo}}), AttributesOf(dst_));
    EXPECT_TRUE(Exists(SrcStream()));
}

TEST_F(ToXattrTest, AStreamThatAnotherProcessReadsIsCopiedAndNoLockIsLeft) {
    PutAll();
    const OtherProcess reader(SrcStream(), F_RDLCK);
    ASSERT_EQ(0, reader.code());
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(All(), AttributesOf(dst_));
}

TEST_F(ToXattrTest, AResourceFileThatCannotBeOpenedFailsWith0x900BehindTheStream) {
    Put(SrcStream(), ThreeAttributes().Build());
    PutLoop(SrcResource());
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_copy.c")));
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_EQ(Without({kFork, kFinderInfo}), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoResource"));
}

// Promise: "MAVOEACopyEx: A failure may record"
TEST_F(ToXattrTest, AnAppleDoubleFileThatCannotBeOpenedFailsTwice) {
    PutLoop(SrcDouble());
    EXPECT_EQ(-2, Copy(1, EA_PLACE_APPLEDOUBLE));
    EXPECT_THAT(Codes(), ElementsAre(0x900, 0x900));
    EXPECT_TRUE(Exists(SrcDouble()));
}

TEST_F(ToXattrTest, SourcesThatCannotBeRemovedAreNoFailure) {
    PutAll();
    const FailCall fault("unlink", EACCES, 0);
    EXPECT_EQ(0, Copy(1));
    EXPECT_TRUE(fault.fired());
    EXPECT_EQ(All(), AttributesOf(dst_));
    ExpectNothingReported();
}

TEST_F(ToXattrTest, APathThatOnlyOpeningTakesCopiesAllAndRemovesNothing) {
    PutAll();
    const std::string src = PathOf(from_, "a", kTooLongPath);
    EXPECT_EQ(-2, EACopyEAStreamToXattr(src.c_str(), dst_.c_str(), 1, EA_PLACE_EADIR));
    EXPECT_EQ(All(), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoEAStream", "a@MavoResource"));
    EXPECT_THAT(Codes(), IsEmpty());
    EXPECT_EQ(0, EACopyEAStreamToXattr(PathOf(from_, "a", kLongestPath).c_str(), dst_.c_str(), 1,
                                       EA_PLACE_EADIR));
    EXPECT_THAT(NamesIn(EADir(from_)), IsEmpty());
}

TEST_F(ToXattrTest, TheNetatalkLayoutIsRead) {
    Put(SrcResource(), NetatalkResourceFile(kInfo, kForkBytes));
    EXPECT_EQ(0, Copy(1));
    EXPECT_EQ((Attributes{{kFork, kForkBytes}, {kFinderInfo, kInfo}}), AttributesOf(dst_));
    EXPECT_FALSE(Exists(SrcResource()));
    ExpectNothingReported();
}

TEST_F(ToXattrTest, TheEntriesMayStandInEitherOrderAndAnywhere) {
    Bytes file =
        Hex("00 05 16 07  00 02 00 00  00*16  00 02 "
            "00 00 00 02  00 00 00 80  00 00 00 03 "   // resource fork, 128
            "00 00 00 09  00 00 01 00  00 00 00 05");  // Finder info, 256; 32 are read
    file.resize(128);
    file = file + Ascii("rsc");
    file.resize(256);
    Put(SrcResource(), file + kInfo);
    EXPECT_EQ(0, Copy());
    EXPECT_EQ((Attributes{{kFork, Ascii("rsc")}, {kFinderInfo, kInfo}}), AttributesOf(dst_));
}

TEST_F(ToXattrTest, TheMagicIsNotLookedAt) {
    Bytes file = ResourceFile(kInfo, {});
    PutU32(file, 0, 0xDEADBEEF);
    Put(SrcResource(), file);
    EXPECT_EQ(0, Copy());
    EXPECT_EQ((Attributes{{kFinderInfo, kInfo}}), AttributesOf(dst_));
    ExpectNothingReported();
}

TEST_F(ToXattrTest, AForkOfLength0IsNotSet) {
    Put(SrcResource(), ResourceFile(kInfo, {}));
    SetAttribute(dst_, kFork, Ascii("the destination's own"));
    EXPECT_EQ(0, Copy());
    EXPECT_EQ((Attributes{{kFork, Ascii("the destination's own")}, {kFinderInfo, kInfo}}),
              AttributesOf(dst_));
}

TEST_F(ToXattrTest, OtherVersionsAreRefused) {
    for (const std::uint32_t version : {0x00010000u, 0u, 0x00020001u, 0x00000200u, 0x00030000u}) {
        Bytes file = ResourceFile(kInfo, kForkBytes);
        PutU32(file, 4, version);
        ExpectRefused(file, 0xA00);
    }
}

TEST_F(ToXattrTest, OtherEntryCountsAreRefused) {
    for (const std::uint32_t count : {0u, 1u, 3u, 12u, 14u, 0x0200u, 0xFFFFu}) {
        Bytes file = NetatalkResourceFile(kInfo, kForkBytes);
        PutU16(file, 24, count);
        ExpectRefused(file, 0xA00);
    }
}

TEST_F(ToXattrTest, HeadersAndDescriptorsThatEndTooSoonAreRefused) {
    const Bytes two = ResourceFile(kInfo, kForkBytes);
    for (std::size_t size = 0; size < 50; ++size) {
        ExpectRefused(Bytes(two.begin(), two.begin() + static_cast<std::ptrdiff_t>(size)), 0xA00);
    }
    const Bytes thirteen = NetatalkResourceFile(kInfo, kForkBytes);
    for (std::size_t size = 26; size < 182; size += 5) {
        ExpectRefused(Bytes(thirteen.begin(), thirteen.begin() + static_cast<std::ptrdiff_t>(size)),
                      0xA00);
    }
}

TEST_F(ToXattrTest, AFileWithoutOneOfTheEntriesIsRefusedWith0x2A00) {
    for (const std::size_t at : {std::size_t{26}, std::size_t{38}}) {
        Bytes other_id = ResourceFile(kInfo, kForkBytes);
        PutU32(other_id, at, 4);
        ExpectRefused(other_id, 0x2A00);
        Bytes no_offset = ResourceFile(kInfo, kForkBytes);
        PutU32(no_offset, at + 4, 0);
        ExpectRefused(no_offset, 0x2A00);
    }
    Bytes netatalk = NetatalkResourceFile(kInfo, kForkBytes);
    PutU32(netatalk, 26 + 4 * 12, 10);
    ExpectRefused(netatalk, 0x2A00);
}

TEST_F(ToXattrTest, AForkThatTheFileDoesNotHoldIsRefusedWithoutTakingMemory) {
    Bytes file = ResourceFile(kInfo, kForkBytes);
    file.pop_back();
    ExpectRefused(file, 0xA00);
    const std::uint32_t lies[][2] = {
        {0xFFFFFFFF, 0xFFFFFFFF}, {82, 0xFFFFFFFF}, {82, 0x7FFFFFFF},
        {0xFFFFFFFF, 1},          {82, 1501},       {0xFFFFFF00, 0x200}};
    for (const auto& [offset, length] : lies) {
        SCOPED_TRACE(length);
        Bytes lying = ResourceFile(kInfo, kForkBytes);
        PutU32(lying, 42, offset);
        PutU32(lying, 46, length);
        ExpectRefused(lying, 0xA00);
    }
}

TEST_F(ToXattrTest, AFinderInfoThatTheFileDoesNotHoldFailsBehindTheFork) {
    for (const std::uint32_t offset : {0xFFFFFFFFu, 82u + 1500u - 31u, 0x7FFFFFF0u}) {
        Reset();
        Bytes file = ResourceFile(kInfo, kForkBytes);
        PutU32(file, 30, offset);
        Put(SrcResource(), file);
        EXPECT_EQ(-1, Copy(1));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xA00, "ea_copy.c")));
        EXPECT_EQ((Attributes{{kFork, kForkBytes}}), AttributesOf(dst_));
        EXPECT_TRUE(Exists(SrcResource()));
        ExpectNothingHeld();
    }
}

TEST_F(ToXattrTest, AForkThatCannotBeSetFailsWith0xB00AndKeepsTheFinderInfoAway) {
    PutAll();
    RefuseToSet({kFork});
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(Codes(), ElementsAre(0xB00));
    EXPECT_EQ(Without({kFork, kFinderInfo}), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoResource"));
}

TEST_F(ToXattrTest, AFinderInfoThatCannotBeSetFailsWith0xB00AndTheFileStays) {
    PutAll();
    RefuseToSet({kFinderInfo});
    EXPECT_EQ(-1, Copy(1));
    EXPECT_THAT(Codes(), ElementsAre(0xB00));
    EXPECT_EQ(Without({kFinderInfo}), AttributesOf(dst_));
    EXPECT_THAT(NamesIn(EADir(from_)), ElementsAre("a@MavoResource"));
}

TEST_F(ToXattrTest, NoDescriptorStaysOpenHoweverOftenItRuns) {
    PutAll();
    for (int i = 0; i < 20; ++i) EXPECT_EQ(0, Copy());
    PutLoop(DstResource());
    for (int i = 0; i < 20; ++i) EXPECT_EQ(0, Copy());
    ExpectNothingHeld();
}

TEST_F(ToXattrTest, WhateverFailsNothingIsLostAndNothingLeaks) {
    for (const int place : {0, 1}) {
        for (const int move : {0, 1}) {
            for (int nth = 1;; ++nth) {
                ASSERT_LT(nth, 300);
                Reset();
                StreamImage image = ThreeAttributes();
                image.finder_info = kInfo;
                image.fork = kForkBytes;
                if (place == 0) {
                    PutAll();
                } else {
                    Put(SrcDouble(), image.Build());
                }
                const FailNthCall fault(nth, EIO);
                const int result = Copy(move, place);
                if (!fault.fired()) {
                    EXPECT_EQ(0, result);
                    break;
                }
                SCOPED_TRACE(fault.name() + " " + std::to_string(nth));
                EXPECT_TRUE(-4 <= result && result <= 0) << result;
                const Attributes now = AttributesOf(dst_);
                EXPECT_TRUE(result != 0 || now == All());
                if (place == 0) {
                    EXPECT_TRUE(Exists(SrcStream()) || now.size() >= 3);
                    EXPECT_TRUE(Exists(SrcResource()) ||
                                (now.contains(kFork) && now.contains(kFinderInfo)));
                }
                EXPECT_TRUE(move != 0 || Exists(place == 0 ? SrcStream() : SrcDouble()));
                ExpectNothingHeld();
            }
        }
    }
}

// ---- The same from an EA directory, with a sync behind it -----------------------------------

TEST_F(ToXattrTest, AnEADirectorysMetadataIsCopiedAndSyncedOnce) {
    for (const int move : {0, 1, 2}) {
        Reset();
        Put(SrcStream(), ThreeAttributes().Build());
        Put(SrcResource(), ResourceFile(kInfo, {}));
        Put(SrcDouble(), Ascii("of another place"));
        EXPECT_EQ(0, EACopyToXattrFS(src_.c_str(), dst_.c_str(), move));
        EXPECT_EQ(Without({kFork}), AttributesOf(dst_));
        EXPECT_EQ(1, syncs_);
        EXPECT_EQ(move == 0 ? 2u : 0u, NamesIn(EADir(from_)).size());
        EXPECT_TRUE(Exists(SrcDouble()));
        ExpectNothingReported();
    }
}

TEST_F(ToXattrTest, AFailureIsLoggedAndNothingSynced) {
    Put(SrcStream(), ThreeAttributes().Build());
    RefuseToSet({"user.one", "user.three"});
    EXPECT_EQ(-1, EACopyToXattrFS(src_.c_str(), dst_.c_str(), 1));
    EXPECT_THAT(TakeLines(),
                ElementsAre(StartsWith(
                    Quoting("0x0B00 ea_copy.c", "Failed to cp [" + src_ + "]->[" + dst_ + "]. "))));
    EXPECT_EQ(0, syncs_);
    EXPECT_EQ(Without({"user.one", "user.three", kFork, kFinderInfo}), AttributesOf(dst_));
    EXPECT_TRUE(Exists(SrcStream()));
}

TEST_F(ToXattrTest, ALineTellsTheCauseOfAFailedOpen) {
    PutLoop(SrcResource());
    EXPECT_EQ(-1, EACopyToXattrFS(src_.c_str(), dst_.c_str(), 0));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Quoting("0x0900 ea_copy.c", "Failed to cp [" + src_ + "]->[" + dst_ +
                                                            "]. " + strerror(ELOOP))));
}

// ---- From attributes to stream and resource file --------------------------------------------

class FromXattrTest : public CopyTest {
 protected:
    int Copy(int place = EA_PLACE_EADIR) const {
        return EACopyXattrToEAStream(src_.c_str(), dst_.c_str(), place);
    }

    void SetAll() {
        SetAttribute(src_, kFinderInfo, kInfo);
        SetAttribute(src_, kFork, kShortFork);
        SetAttribute(src_, "user.one", Ascii("1"));
        SetAttribute(src_, "user.two", Pattern(2000, 2));
        SetAttribute(src_, "user.three", Ascii("3"));
        listed_ = {"user.one", kFork, "user.two", kFinderInfo, "user.three"};
    }
    static StreamImage AllInStream() {
        return {.attributes = {{"user.one", Ascii("1")},
                               {"user.two", Pattern(2000, 2)},
                               {"user.three", Ascii("3")}}};
    }
    static StreamImage InStream(const std::vector<std::string>& names) {
        StreamImage image = AllInStream();
        std::erase_if(image.attributes, [&](const Attribute& attribute) {
            return std::find(names.begin(), names.end(), attribute.name) == names.end();
        });
        return image;
    }
    Bytes DstStreamContent() const { return Content(DstStream()); }

    // Reading these attributes fails with EIO.
    static void RefuseToGet(const std::vector<std::string>& names) {
        const auto get = Hooks().getxattr;
        Hooks().getxattr = [=](const char* path, const char* name, void* value, size_t size) {
            if (std::find(names.begin(), names.end(), name) != names.end()) {
                errno = EIO;
                return ssize_t{-1};
            }
            return get(path, name, value, size);
        };
    }

    std::string CannotGet(const std::string& record = "none") const {
        return Quoting(record, "Fail to get EA(" + src_ + "). Input/output error");
    }
    std::string CannotGet(const std::string& name, int error,
                          const std::string& record = "none") const {
        return Quoting(record, "Fail to get EA(" + src_ + ", " + name + "). " + strerror(error));
    }
};

TEST_F(FromXattrTest, WithoutAttributesNothingIsMade) {
    for (const int place : {0, 1}) {
        EXPECT_EQ(0, Copy(place));
        EXPECT_FALSE(Exists(EADir(to_)));
        EXPECT_FALSE(Exists(DstDouble()));
        ExpectNothingReported();
    }
}

TEST_F(FromXattrTest, FinderInfoAndForkGoIntoTheResourceFileTheOthersIntoTheStream) {
    const Umask mask(077);
    SetAll();
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(ResourceFile(kInfo, kShortFork), Content(DstResource()));
    EXPECT_EQ(AllInStream().Build(), DstStreamContent());
    EXPECT_EQ(0777, ModeOf(DstResource()));
    EXPECT_EQ(0777, ModeOf(DstStream()));
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoEAStream", "b@MavoResource"));
    ExpectNothingReported();
    ExpectNothingHeld();
}

TEST_F(FromXattrTest, TheHeadOfTheResourceFileIs84BytesOfItsOwn) {
    SetAttribute(src_, kFinderInfo, {});
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(Hex("00 05 16 07 00 02 00 00 4D 41 56 4F 4E 49 43 53 20 20 20 20 20 20 20 20 00 02 "
                  "00 00 00 09 00 00 00 32 00 00 00 20 00 00 00 02 00 00 00 52 00 00 00 00 00*34"),
              Content(DstResource()));
    ExpectNothingReported();
}

TEST_F(FromXattrTest, WithoutFinderInfoAndForkThereIsNoResourceFile) {
    SetAttribute(src_, "user.one", Ascii("1"));
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(InStream({"user.one"}).Build(), DstStreamContent());
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoEAStream"));
    ExpectNothingReported();
}

TEST_F(FromXattrTest, WithoutOtherAttributesThereIsNoStream) {
    SetAttribute(src_, kFinderInfo, kInfo);
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(ResourceFile(kInfo, {0, 0}).size(), 84u);
    Bytes expected = ResourceHead(0);
    std::copy(kInfo.begin(), kInfo.end(), expected.begin() + 50);
    EXPECT_EQ(expected, Content(DstResource()));
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoResource"));
}

TEST_F(FromXattrTest, AForkAloneHasZerosForFinderInfo) {
    SetAttribute(src_, kFork, kShortFork);
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(ResourceFile(Repeat(0, 32), kShortFork), Content(DstResource()));

    Reset();
    SetAttribute(src_, kFork, Ascii("!"));
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(ResourceFile(Repeat(0, 32), Ascii("!") + Bytes{0}).size(),
              Content(DstResource()).size());
    EXPECT_EQ(1u, U32At(Content(DstResource()), 46));
    EXPECT_EQ('!', Content(DstResource())[82]);
}

TEST_F(FromXattrTest, FinderInfoThatIsTooLongIsWrittenWholeAndTheForkOverIt) {
    SetAttribute(src_, kFinderInfo, Pattern(100, 9));
    EXPECT_EQ(0, Copy());
    Bytes expected = ResourceHead(0);
    expected.resize(50);
    expected = expected + Pattern(100, 9);
    EXPECT_EQ(expected, Content(DstResource()));

    Reset();
    SetAttribute(src_, kFinderInfo, Pattern(100, 9));
    SetAttribute(src_, kFork, Ascii("fork"));
    EXPECT_EQ(0, Copy());
    PutU32(expected, 46, 4);
    const Bytes fork = Ascii("fork");
    std::copy(fork.begin(), fork.end(), expected.begin() + 82);
    EXPECT_EQ(expected, Content(DstResource()));
}

TEST_F(FromXattrTest, FinderInfoThatIsTooShortEndsInZeros) {
    SetAttribute(src_, kFinderInfo, Ascii("TEXTttxt"));
    EXPECT_EQ(0, Copy());
    Bytes expected = ResourceHead(0);
    expected.resize(50);
    expected = expected + Ascii("TEXTttxt") + Repeat(0, 26);
    EXPECT_EQ(expected, Content(DstResource()));
}

TEST_F(FromXattrTest, FilesThatExistAreReplaced) {
    Put(DstResource(), Pattern(10'000));
    Put(DstStream(), StreamImage{.attributes = {{"user.former", Pattern(5000)}}}.Build());
    SetAll();
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(ResourceFile(kInfo, kShortFork), Content(DstResource()));
    EXPECT_EQ(AllInStream().Build(), DstStreamContent());
}

TEST_F(FromXattrTest, AResourceFileThatNothingReplacesStays) {
    Put(DstResource(), Ascii("former"));
    SetAttribute(src_, "user.one", Ascii("1"));
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(Ascii("former"), Content(DstResource()));
}

TEST_F(FromXattrTest, AttributesWithoutBytesAreCopied) {
    SetAttribute(src_, "user.empty", {});
    EXPECT_EQ(0, Copy());
    EXPECT_EQ((StreamImage{.attributes = {{"user.empty", {}}}}.Build()), DstStreamContent());
    ExpectNothingReported();
}

TEST_F(FromXattrTest, EveryAttributeIsWrittenAndFlushedOnItsOwn) {
    SetAll();
    TakeCallNames();
    EXPECT_EQ(0, Copy());
    const auto names = TakeCallNames();
    // The write syncs once itself.
    EXPECT_EQ(6, std::count(names.begin(), names.end(), "fsync"));
}

TEST_F(FromXattrTest, TheAppleDoubleFileTakesAll) {
    const Umask mask(077);
    SetAll();
    Put(DstDouble(), Pattern(9000));
    EXPECT_EQ(0, Copy(EA_PLACE_APPLEDOUBLE));
    StreamImage expected = AllInStream();
    expected.filler = Ascii("MAVONICS        ");
    expected.finder_info = kInfo;
    expected.fork = kShortFork;
    EXPECT_EQ(expected.Build(), Content(DstDouble()));
    EXPECT_EQ(0777, ModeOf(DstDouble()));
    EXPECT_FALSE(Exists(EADir(to_)));
    ExpectNothingReported();
    ExpectNothingHeld();
}

TEST_F(FromXattrTest, AnAppleDoubleFileIsNotMadeForTheStreamAlone) {
    SetAttribute(src_, "user.one", Ascii("1"));
    EXPECT_EQ(-1, Copy(EA_PLACE_APPLEDOUBLE));
    EXPECT_FALSE(Exists(DstDouble()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x900, "ea_copy.c")));
    EXPECT_THAT(TakeLines(), ElementsAre(Quoting("none", "Fail to open eastream(" + dst_ +
                                                             "). No such file or directory")));
    ExpectNothingHeld();
}

TEST_F(FromXattrTest, AnAppleDoubleFileThatExistsTakesTheStreamsAttributesAndKeepsTheRest) {
    SetAttribute(src_, "user.one", Ascii("1"));
    StreamImage image{
        .attributes = {{"user.former", Ascii("former")}}, .fork = kShortFork, .finder_info = kInfo};
    Put(DstDouble(), image.Build());
    EXPECT_EQ(0, Copy(EA_PLACE_APPLEDOUBLE));
    image.attributes.push_back({"user.one", Ascii("1")});
    EXPECT_EQ(image.Build(), Content(DstDouble()));
}

TEST_F(FromXattrTest, AnAppleDoubleFilesAttributeOfTheNameIsNotOverwritten) {
    SetAttribute(src_, "user.one", Ascii("1"));
    const StreamImage image{.attributes = {{"user.one", Ascii("former")}}};
    Put(DstDouble(), image.Build());
    EXPECT_EQ(-1, Copy(EA_PLACE_APPLEDOUBLE));
    EXPECT_THAT(Codes(), ElementsAre(0xB00));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Quoting("none", "Fail to write eastream(" + dst_ + "). File exists")));
    EXPECT_EQ(image.Build(), Content(DstDouble()));
}

TEST_F(FromXattrTest, NamesThatCannotBeListedFail) {
    SetAll();
    const FailCall fault("listxattr", EIO);
    EXPECT_EQ(-1, Copy());
    EXPECT_THAT(Codes(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_FALSE(Exists(EADir(to_)));
    ExpectNothingHeld();
}

TEST_F(FromXattrTest, AListThatTakesNoMoreNamesFails) {
    SetAll();
    Platform().pushes_until_failure = 2;
    EXPECT_EQ(-1, Copy());
    EXPECT_FALSE(Exists(EADir(to_)));
    ExpectNothingHeld();
}

TEST_F(FromXattrTest, ValuesThatCannotBeReadAreCountedAndLoggedAndTheOthersCopied) {
    SetAll();
    RefuseToGet({"user.one"});
    EXPECT_EQ(-2, Copy());
    EXPECT_THAT(TakeLines(), ElementsAre(CannotGet()));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    EXPECT_EQ(ResourceFile(kInfo, kShortFork), Content(DstResource()));
    EXPECT_EQ(InStream({"user.two", "user.three"}).Build(), DstStreamContent());

    Reset();
    SetAll();
    RefuseToGet({"user.one", "user.two", "user.three"});
    EXPECT_EQ(-4, Copy());
    EXPECT_THAT(TakeLines(), ElementsAre(CannotGet(), CannotGet(), CannotGet()));
    EXPECT_EQ(ResourceFile(kInfo, kShortFork), Content(DstResource()));
    EXPECT_FALSE(Exists(DstStream()));
}

TEST_F(FromXattrTest, AFinderInfoThatCannotBeReadIsLeftOutOfTheResourceFile) {
    SetAll();
    RefuseToGet({kFinderInfo});
    EXPECT_EQ(-2, Copy());
    EXPECT_THAT(TakeLines(), ElementsAre(CannotGet()));
    EXPECT_EQ(ResourceFile(Repeat(0, 32), kShortFork), Content(DstResource()));
    EXPECT_EQ(AllInStream().Build(), DstStreamContent());
}

TEST_F(FromXattrTest, AForkThatCannotBeReadIsLeftOutOfTheResourceFile) {
    SetAll();
    RefuseToGet({"user.three"});
    Hooks().fopen = [](const char*, const char*) -> FILE* {
        errno = EACCES;
        return nullptr;
    };
    EXPECT_EQ(-3, Copy());
    EXPECT_THAT(TakeLines(),
                ElementsAre("ea_xattr_get:LINE Fail to open(" + src_ + "/rsrc). Permission denied",
                            Quoting("none", "Fail to get EA(" + src_ + "). Permission denied"),
                            CannotGet()));
    Bytes expected = ResourceHead(0);
    std::copy(kInfo.begin(), kInfo.end(), expected.begin() + 50);
    EXPECT_EQ(expected, Content(DstResource()));
    EXPECT_EQ(InStream({"user.one", "user.two"}).Build(), DstStreamContent());
}

TEST_F(FromXattrTest, WithoutEitherOfThemThatWasReadThereIsNoResourceFile) {
    SetAttribute(src_, kFinderInfo, kInfo);
    SetAttribute(src_, "user.one", Ascii("1"));
    listed_ = {kFork, kFinderInfo, "user.one"};  // a fork that is empty counts as absent
    RefuseToGet({kFinderInfo});
    EXPECT_EQ(-3, Copy());
    EXPECT_THAT(TakeLines(),
                ElementsAre(Quoting("0x0700 ea_xattr_get",
                                    "Fail to get EA(" + src_ + "). " + strerror(ENODATA)),
                            CannotGet("0x0700 ea_xattr_get")));
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoEAStream"));
}

TEST_F(FromXattrTest, AValueLongerThanTheBufferIsReadAgainAndTheBufferStaysThatLong) {
    SetAttribute(src_, "user.long", Pattern(1700, 1));
    SetAttribute(src_, "user.next", Pattern(1600, 2));
    listed_ = {"user.long", "user.next"};
    TakeCalls();
    EXPECT_EQ(0, Copy());
    std::vector<std::string> calls = TakeCalls();
    std::erase_if(calls, [](const std::string& call) { return !call.starts_with("getxattr("); });
    EXPECT_THAT(calls, ElementsAre("getxattr(" + src_ + ", user.long, 1024)",
                                   "getxattr(" + src_ + ", user.long, 0)",
                                   "getxattr(" + src_ + ", user.long, 1700)",
                                   "getxattr(" + src_ + ", user.next, 1700)"));
    EXPECT_EQ((StreamImage{
                  .attributes = {{"user.long", Pattern(1700, 1)}, {"user.next", Pattern(1600, 2)}}}
                   .Build()),
              DstStreamContent());
    ExpectNothingReported();
}

TEST_F(FromXattrTest, AForkLongerThanTheBufferIsReadAgain) {
    SetAttribute(src_, kFork, Pattern(100'000));
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(ResourceFile(Repeat(0, 32), Pattern(100'000)), Content(DstResource()));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xBF00, "ea_xattr_get")));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(FromXattrTest, AValueOfExactly1024BytesIsReadAtOnce) {
    SetAttribute(src_, "user.fits", Pattern(1024));
    TakeCallNames();
    EXPECT_EQ(0, Copy());
    const auto names = TakeCallNames();
    EXPECT_EQ(1, std::count(names.begin(), names.end(), "getxattr"));
}

TEST_F(FromXattrTest, ASecondReadThatFailsIsLoggedWithTheName) {
    for (const int error : {EIO, ERANGE}) {
        Reset();
        SetAttribute(src_, "user.long", Pattern(1700));
        SetAttribute(src_, "user.short", Ascii("s"));
        listed_ = {"user.long", "user.short"};
        const FailCall fault("getxattr", error, 3);
        EXPECT_EQ(-2, Copy());
        EXPECT_THAT(TakeLines(), ElementsAre(CannotGet("user.long", error)));
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_EQ((StreamImage{.attributes = {{"user.short", Ascii("s")}}}.Build()),
                  DstStreamContent());
    }
}

TEST_F(FromXattrTest, ASecondReadOfTheFinderInfoThatFailsIsLoggedWithTheNameAndCounted) {
    SetAttribute(src_, kFinderInfo, Pattern(1700));
    SetAttribute(src_, "user.short", Ascii("s"));
    const FailCall fault("getxattr", EIO, 3);
    EXPECT_EQ(-2, Copy());
    EXPECT_THAT(TakeLines(), ElementsAre(CannotGet(kFinderInfo, EIO)));
    EXPECT_THAT(NamesIn(EADir(to_)), ElementsAre("b@MavoEAStream"));
}

// The allocations in order: the buffer, the list of names, then what is named here.
constexpr int kThirdAllocation = 3;

TEST_F(FromXattrTest, WithoutMemoryForTheBufferOrTheNamesNothingIsMade) {
    for (const int nth : {1, 2}) {
        SCOPED_TRACE(nth);
        Reset();
        SetAll();
        const FailCall fault("malloc", ENOMEM, nth);
        EXPECT_EQ(-1, Copy());
        EXPECT_TRUE(fault.fired());
        EXPECT_FALSE(Exists(EADir(to_)));
        EXPECT_THAT(TakeLog(), IsEmpty());
        ExpectNothingHeld();
    }
}

TEST_F(FromXattrTest, ABufferThatCannotGrowForFinderInfoOrForkEndsItWith0x100) {
    for (const bool failed_before : {false, true}) {
        Reset();
        SetAttribute(src_, kFinderInfo, kInfo);
        SetAttribute(src_, kFork, kForkBytes);
        SetAttribute(src_, "user.one", Ascii("1"));
        if (failed_before) RefuseToGet({kFinderInfo});
        const FailCall fault("malloc", ENOMEM, failed_before ? kThirdAllocation : 4);
        EXPECT_EQ(failed_before ? -2 : -1, Copy());
        EXPECT_THAT(Codes(), ElementsAre(0x100));
        EXPECT_EQ(failed_before ? 1u : 0u, TakeLog().size());
        EXPECT_FALSE(Exists(EADir(to_)));
        ExpectNothingHeld();
    }
}

TEST_F(FromXattrTest, AFinderInfoThatCannotBeKeptIsCountedWith0x100AndTheRestCopied) {
    SetAll();
    listed_ = {kFinderInfo, kFork, "user.one"};
    const FailCall fault("malloc", ENOMEM, kThirdAllocation);
    EXPECT_EQ(-2, Copy());
    EXPECT_THAT(TakeRecords(), AllOf(Contains(RecordOf(0x100, "ea_copy.c")),
                                     Not(Contains(RecordOf(0x900, "ea_copy.c")))));
    EXPECT_EQ(ResourceFile(Repeat(0, 32), kShortFork), Content(DstResource()));
    EXPECT_EQ(InStream({"user.one"}).Build(), DstStreamContent());
    ExpectNothingHeld();
}

TEST_F(FromXattrTest, ABufferThatCannotGrowStopsTheSecondPassWith0x100) {
    int seen = 0;
    for (int nth = kThirdAllocation;; ++nth) {
        ASSERT_LT(nth, 200);
        Reset();
        SetAttribute(src_, "user.one", Ascii("1"));
        SetAttribute(src_, "user.two", Pattern(2000, 2));
        SetAttribute(src_, "user.three", Ascii("3"));
        listed_ = {"user.one", "user.two", "user.three"};
        const FailCall fault("malloc", ENOMEM, nth);
        const int result = Copy();
        if (!fault.fired()) break;
        ExpectNothingHeld();
        if (Codes() != std::vector<int>{0x100}) continue;  // another allocation
        ++seen;
        EXPECT_EQ(-1, result);
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_EQ(InStream({"user.one"}).Build(), DstStreamContent());
    }
    EXPECT_EQ(1, seen);
}

TEST_F(FromXattrTest, AStoppedPassTellsWhatHasBeenCounted) {
    SetAttribute(src_, "user.one", Ascii("1"));
    SetAttribute(src_, "user.two", Pattern(2000, 2));
    listed_ = {"user.one", "user.two"};
    RefuseToGet({"user.one"});
    const FailCall fault("malloc", ENOMEM, kThirdAllocation);
    EXPECT_EQ(-2, Copy());
    EXPECT_THAT(Codes(), ElementsAre(0x100));
    EXPECT_FALSE(Exists(DstStream()));
}

TEST_F(FromXattrTest, AResourceFileThatCannotBeOpenedIsLoggedAndEndsIt) {
    for (const bool failed_before : {false, true}) {
        Reset();
        SetAll();
        PutLoop(DstResource());
        if (failed_before) RefuseToGet({kFinderInfo});
        EXPECT_EQ(failed_before ? -2 : -1, Copy());
        EXPECT_THAT(Codes(), ElementsAre(0x900));
        EXPECT_EQ(Quoting("none", "Fail to open mavoresource(" + dst_ + "). " + strerror(ELOOP)),
                  TakeLines().back());
        EXPECT_FALSE(Exists(DstStream()));
        ExpectNothingHeld();
    }
}

TEST_F(FromXattrTest, ADestinationWhoseDirectoryIsMissingCannotBeOpened) {
    dst_ = to_ + "/missing/b";
    SetAttribute(src_, kFinderInfo, kInfo);
    EXPECT_EQ(-1, Copy());
    EXPECT_THAT(TakeLines(), Contains(HasSubstr("]Fail to open mavoresource(" + dst_ + "). ")));
    EXPECT_THAT(Codes(), ElementsAre(0x900));
}

TEST_F(FromXattrTest, AResourceFileThatCannotBeWrittenFailsWith0xB00AndStaysAsItIs) {
    for (const int nth : {1, 2, 3}) {
        SCOPED_TRACE(nth);
        Reset();
        SetAll();
        const FailCall fault("pwrite", ENOSPC, nth);
        EXPECT_EQ(-1, Copy());
        EXPECT_TRUE(fault.fired());
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xB00, "ea_copy.c")));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_TRUE(Exists(DstResource()));
        EXPECT_FALSE(Exists(DstStream()));
        ExpectNothingHeld();
    }
}

TEST_F(FromXattrTest, AShortWriteOfTheResourceFileFailsWith0xB00) {
    for (const int nth : {1, 2, 3}) {
        SCOPED_TRACE(nth);
        Reset();
        SetAll();
        const ShortCall fault("pwrite", nth, 10);
        EXPECT_EQ(-1, Copy());
        EXPECT_TRUE(fault.fired());
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xB00, "ea_copy.c")));
        EXPECT_EQ(nth == 1 ? 10u : nth == 2 ? 84u : 92u, Content(DstResource()).size());
        EXPECT_FALSE(Exists(DstStream()));
    }
}

TEST_F(FromXattrTest, AStreamThatCannotBeOpenedIsLoggedAndTheResourceFileStays) {
    for (const bool failed_before : {false, true}) {
        Reset();
        SetAll();
        PutLoop(DstStream());
        if (failed_before) RefuseToGet({"user.one"});
        EXPECT_EQ(failed_before ? -2 : -1, Copy());
        EXPECT_THAT(Codes(), ElementsAre(0x900));
        EXPECT_EQ(Quoting("none", "Fail to open eastream(" + dst_ + "). " + strerror(ELOOP)),
                  TakeLines().back());
        EXPECT_EQ(ResourceFile(kInfo, kShortFork), Content(DstResource()));
        ExpectNothingHeld();
    }
}

TEST_F(FromXattrTest, AStreamThatAnotherProcessHasCannotBeOpened) {
    SetAll();
    Put(DstStream(), {});
    const OtherProcess other(DstStream(), F_RDLCK);
    ASSERT_EQ(0, other.code());
    EXPECT_EQ(-1, Copy());
    EXPECT_THAT(Codes(), ElementsAre(0x900));
    EXPECT_THAT(TakeLines(),
                ElementsAre(AllOf(StartsWith(Line("[0x0400 ")),
                                  HasSubstr("]Fail to open eastream(" + dst_ + "). "))));
}

TEST_F(FromXattrTest, AModeThatCannotBeSetIsNoFailure) {
    SetAll();
    MakeDirectory(EADir(to_));
    const FailCall fault("fchmod", EPERM, 0);
    EXPECT_EQ(0, Copy());
    EXPECT_TRUE(fault.fired());
    ExpectNothingReported();
}

TEST_F(FromXattrTest, AnAttributeThatTheStreamRefusesStopsThePassAndLaterOnesAreNotWritten) {
    const std::string long_name = "user." + std::string(250, 'n');  // one more than streams take
    for (const bool failed_before : {false, true}) {
        Reset();
        SetAttribute(src_, "user.zero", Ascii("0"));
        SetAttribute(src_, "user.one", Ascii("1"));
        SetAttribute(src_, long_name, Ascii("x"));
        SetAttribute(src_, "user.three", Ascii("3"));
        listed_ = {"user.zero", "user.one", long_name, "user.three"};
        if (failed_before) {
            RefuseToGet({"user.zero"});
        } else {
            listed_->erase(listed_->begin());
        }
        EXPECT_EQ(failed_before ? -2 : -1, Copy());
        EXPECT_THAT(Codes(), ElementsAre(0xB00));
        EXPECT_THAT(TakeLines().back(),
                    AllOf(StartsWith(Line("[0x0D00 eas_write:LINE]")),
                          HasSubstr("]Fail to write eastream(" + dst_ + "). ")));
        EXPECT_EQ(InStream({"user.one"}).Build(), DstStreamContent());
        ExpectNothingHeld();
    }
}

// Between volumes that both have attributes nothing ends with one that finds no room.
TEST_F(FromXattrTest, AnAttributeWithoutBytesIsCopiedBehindOneThatFoundNoRoom) {
    SetAttribute(src_, "user.long", Pattern(2000));
    SetAttribute(src_, "user.empty", {});
    listed_ = {"user.long", "user.empty"};
    const FailCall fault("malloc", ENOMEM, kThirdAllocation);
    EXPECT_EQ(-1, CopyXattrs(src_.c_str(), dst_.c_str()));
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(Codes(), ElementsAre(0x100));
    EXPECT_EQ((Attributes{{"user.empty", {}}}), AttributesOf(dst_));
    ExpectNothingHeld();
}

TEST_F(FromXattrTest, NoLockIsLeftOnTheStream) {
    SetAll();
    EXPECT_EQ(0, Copy());
    EXPECT_EQ(F_UNLCK, LockInTheWay(DstStream(), F_WRLCK));
}

TEST_F(FromXattrTest, WhateverFailsNothingLeaksAndSuccessIsWhole) {
    for (const int place : {0, 1}) {
        for (int nth = 1;; ++nth) {
            ASSERT_LT(nth, 500);
            Reset();
            SetAll();
            const FailNthCall fault(nth, EIO);
            const int result = Copy(place);
            ExpectNothingHeld();
            if (!fault.fired()) {
                EXPECT_EQ(0, result);
                break;
            }
            SCOPED_TRACE(fault.name() + " " + std::to_string(nth));
            EXPECT_TRUE(result == 0 || result == -1 || result == -2) << result;
            if (result == 0 && place == 0) {
                EXPECT_EQ(ResourceFile(kInfo, kShortFork), Content(DstResource()));
                EXPECT_EQ(AllInStream().Build(), DstStreamContent());
            }
            EXPECT_EQ(kShortFork, AttributesOf(src_)[kFork]);
        }
    }
}

// ---- The same into an EA directory, source removed ------------------------------------------

TEST_F(FromXattrTest, OnlyAMoveOf1RemovesTheSourcesResourceFile) {
    for (const int move : {0, 1, 2, -1}) {
        Reset();
        SetAll();
        Put(SrcResource(), Ascii("former"));
        Put(SrcStream(), Ascii("former"));
        EXPECT_EQ(0, EACopyXattrToEADirFS(src_.c_str(), dst_.c_str(), move));
        EXPECT_EQ(ResourceFile(kInfo, kShortFork), Content(DstResource()));
        EXPECT_EQ(AllInStream().Build(), DstStreamContent());
        EXPECT_EQ(move != 1, Exists(SrcResource()));
        EXPECT_TRUE(Exists(SrcStream()));
        EXPECT_EQ(5u, AttributesOf(src_).size());
        ExpectNothingReported();
    }
}

TEST_F(FromXattrTest, AMoveOfASourceWithoutAResourceFileSucceeds) {
    SetAll();
    EXPECT_EQ(0, EACopyXattrToEADirFS(src_.c_str(), dst_.c_str(), 1));
    ExpectNothingReported();
}

TEST_F(FromXattrTest, AFailedCopyIsLoggedAndTheSourcesResourceFileStays) {
    SetAll();
    Put(SrcResource(), Ascii("former"));
    PutLoop(DstResource());
    EXPECT_EQ(-1, EACopyXattrToEADirFS(src_.c_str(), dst_.c_str(), 1));
    EXPECT_EQ(Quoting("0x0900 ea_copy.c",
                      "Failed to cp [" + src_ + "]->[" + dst_ + "]. " + strerror(ELOOP)),
              TakeLines().back());
    EXPECT_TRUE(Exists(SrcResource()));
}

TEST_F(FromXattrTest, CountedFailuresBecomeMinus1) {
    SetAll();
    RefuseToGet({"user.one", "user.two"});
    EXPECT_EQ(-1, EACopyXattrToEADirFS(src_.c_str(), dst_.c_str(), 0));
    const auto lines = TakeLines();
    ASSERT_EQ(3u, lines.size());
    EXPECT_THAT(lines[2],
                StartsWith(Quoting("none", "Failed to cp [" + src_ + "]->[" + dst_ + "]. ")));
    EXPECT_EQ(InStream({"user.three"}).Build(), DstStreamContent());
}

TEST_F(FromXattrTest, ASourceThatCannotBeRemovedIsLoggedAndTheCopyStays) {
    SetAll();
    Put(SrcResource(), Ascii("former"));
    const FailCall fault("unlink", EACCES);
    EXPECT_EQ(-1, EACopyXattrToEADirFS(src_.c_str(), dst_.c_str(), 1));
    EXPECT_THAT(Codes(), ElementsAre(0x2A00));
    EXPECT_THAT(TakeLines(),
                ElementsAre(Quoting("0x2A00 ea_copy.c", "Failed to remove [" + src_ + "]->[" +
                                                            dst_ + "]. Permission denied")));
    EXPECT_EQ(AllInStream().Build(), DstStreamContent());
    EXPECT_TRUE(Exists(SrcResource()));
}

TEST_F(FromXattrTest, ThereAndBackAgainNothingHasChanged) {
    SetAll();
    EXPECT_EQ(0, EACopyXattrToEADirFS(src_.c_str(), dst_.c_str(), 0));
    const std::string third = to_ + "/c";
    WriteFile(third, {});
    WriteFile(ForkFile(third), {});
    ASSERT_EQ(0, chmod(third.c_str(), 0744));
    EXPECT_EQ(0, EACopyToXattrFS(dst_.c_str(), third.c_str(), 1));
    EXPECT_EQ(AttributesOf(src_), AttributesOf(third));
    EXPECT_THAT(NamesIn(EADir(to_)), IsEmpty());
    ExpectNothingReported();
}

}  // namespace
}  // namespace mavoea::test

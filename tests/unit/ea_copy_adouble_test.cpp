// Rewriting AppleDouble files into the layout of the library's resource files.

#include "ops/ea_copy_adouble.h"

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <string>
#include <vector>

#include "tests/support/fake_platform.h"
#include "tests/support/freed_descriptor.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/process.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Le;
using ::testing::Lt;
using ::testing::Not;
using ::testing::StartsWith;

constexpr int kAllModes[] = {0, 1, 2, 3};

Bytes Slice(const Bytes& bytes, std::size_t at, std::size_t length) {
    const auto begin = bytes.begin() + static_cast<std::ptrdiff_t>(at);
    return Bytes(begin, begin + static_cast<std::ptrdiff_t>(length));
}

// Header, Finder info at 50, fork at 82: what a file with the first 24 bytes `head` becomes.
Bytes Rewritten(const Bytes& head, const Bytes& finder_info, const Bytes& fork,
                bool fork_first = false) {
    const Bytes finder_entry = Hex("00 00 00 09  00 00 00 32  00 00 00 20");
    Bytes fork_entry = Hex("00 00 00 02  00 00 00 52  00 00 00 00");
    PutU32(fork_entry, 8, fork.size());
    return Slice(head, 0, 24) + Hex("00 02") + (fork_first ? fork_entry : finder_entry) +
           (fork_first ? finder_entry : fork_entry) + finder_info + fork;
}

// A file whose Finder info and fork lie elsewhere than in a rewritten one: 18 bytes of something
// else behind the descriptors, Finder info at 68, more of something else, fork at 112.
Bytes Spread(const Bytes& finder_info, const Bytes& fork) {
    Bytes file = Hex("00 05 16 07  00 02 00 00 'any filler here.' 00 02"
                     "00 00 00 09  00 00 00 44  00 00 00 20  00 00 00 02  00 00 00 70  00 00 00 00"
                     "AA*18") +
                 finder_info + Repeat(0xBB, 12) + fork;
    PutU32(file, kForkLengthAt, fork.size());
    return file;
}

class CopyAdoubleTest : public ::testing::Test {
 protected:
    CopyAdoubleTest() {
        ResetKernel();
        ResetPlatform();
        live_blocks_ = TakeAllocations().live;
        descriptors_ = OpenDescriptors();
    }
    ~CopyAdoubleTest() override {
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        EXPECT_THAT(TakeRecords(), IsEmpty());
        EXPECT_THAT(TakeLog(), IsEmpty());
        ResetKernel();
        ResetPlatform();
    }

    int Rewrite() const { return EACopyAdoubleV2(src_.c_str(), dst_.c_str(), 1); }
    int Rewrite(const Bytes& source) const {
        WriteFile(src_, source);
        return Rewrite();
    }

    static void ExpectLogged(const std::string& text) {
        EXPECT_THAT(TakeLog(), ElementsAre("ea_copy.c:LINE" + text));
    }
    // Where the reason is nobody's but the machine's.
    static void ExpectLoggedBegin(const std::string& text) {
        EXPECT_THAT(TakeLog(), ElementsAre(StartsWith("ea_copy.c:LINE" + text)));
    }

    // The calls of one name among those since the last time.
    static std::vector<std::string> TakeCallsOf(const std::string& name) {
        std::vector<std::string> calls = TakeCalls();
        std::erase_if(calls,
                      [&](const std::string& call) { return !call.starts_with(name + "("); });
        return calls;
    }

    TempDir dir_;
    const std::string src_ = dir_ / "src";
    const std::string dst_ = dir_ / "dst";
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// ---- Layouts ------------------------------------------------------------------------------------

// Promise: "AppleDouble: 0 |"
// Promise: "AppleDouble: 4 |"
// Promise: "AppleDouble: 8 |"
// Promise: "AppleDouble: 24 |"
// Promise: "AppleDouble: 26 |"
// Promise: "AppleDouble: A **resource file** that the library"
TEST_F(CopyAdoubleTest, ARewrittenFileHasFinderInfoAt50AndForkAt82) {
    EXPECT_EQ(0, Rewrite(Hex("00 05 16 07  00 02 00 00 'Mac OS X        ' 00 02"
                             "00 00 00 09  00 00 00 32  00 00 00 4E"
                             "00 00 00 02  00 00 00 80  00 00 00 05"
                             "'TEXTttxt' 01 02 03 04  00*20 "
                             "00 00 'ATTR' 00 00 00 00  00 00 00 80  00 00 00 78  00*20"
                             "'unused..' 'fork!'")));
    EXPECT_EQ(Hex("00 05 16 07  00 02 00 00 'Mac OS X        ' 00 02"
                  "00 00 00 09  00 00 00 32  00 00 00 20"
                  "00 00 00 02  00 00 00 52  00 00 00 05"
                  "'TEXTttxt' 01 02 03 04  00*20 "
                  "'fork!'"),
              ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, EveryLayoutOfMacsAndNetatalkIsRewrittenWhole) {
    for (const MacFile& file : AllMacFiles()) {
        SCOPED_TRACE(file.layout);
        const bool fork_first = file.layout == "thirteen entries";
        for (const int mode : {0, 1}) {
            unlink(dst_.c_str());
            WriteFile(src_, file.bytes);
            EXPECT_EQ(0, EACopyAdoubleV2(src_.c_str(), dst_.c_str(), mode));
            EXPECT_EQ(
                Rewritten(file.bytes, file.contents.finder_info, file.ForkInUse(), fork_first),
                ReadFile(dst_));
            EXPECT_EQ(file.bytes, ReadFile(src_));
        }
    }
}

// Promise: "AppleDouble: Of the ids"
TEST_F(CopyAdoubleTest, WhatIsAtOtherPlacesIsFoundByItsDescriptors) {
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32, 1), Pattern(5000, 2))));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32, 1), Pattern(5000, 2)), ReadFile(dst_));
}

// Promise: "AppleDouble: A rewrite keeps"
TEST_F(CopyAdoubleTest, AForkListedFirstStaysFirst) {
    const StreamImage image = {
        .attributes = {{"a", Ascii("value")}},
        .fork = Pattern(100, 3),
        .finder_info = Pattern(32, 4),
        .fork_first = true,
    };
    EXPECT_EQ(0, Rewrite(image.Build()));
    EXPECT_EQ(Hex("00 05 16 07  00 02 00 00 'Mac OS X        ' 00 02"
                  "00 00 00 02  00 00 00 52  00 00 00 64"
                  "00 00 00 09  00 00 00 32  00 00 00 20") +
                  Pattern(32, 4) + Pattern(100, 3),
              ReadFile(dst_));
}

// Promise: "AppleDouble: A rewrite keeps"
TEST_F(CopyAdoubleTest, MagicAndFillerAreKeptAsTheyAre) {
    Bytes file = Spread(Pattern(32), Ascii("fork"));
    PutU32(file, 0, 0x01020304);
    EXPECT_EQ(0, Rewrite(file));
    EXPECT_EQ(Rewritten(file, Pattern(32), Ascii("fork")), ReadFile(dst_));
    EXPECT_EQ(Hex("01 02 03 04  00 02 00 00 'any filler here.'"), Slice(ReadFile(dst_), 0, 24));
}

TEST_F(CopyAdoubleTest, TheFinderInfoIsAlways32Bytes) {
    for (const unsigned length : {0u, 1u, 31u, 33u, 3760u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(length);
        Bytes file = Spread(Pattern(32, 1), Ascii("fork"));
        PutU32(file, kFinderLengthAt, length);
        EXPECT_EQ(0, Rewrite(file));
        EXPECT_EQ(Rewritten(file, Pattern(32, 1), Ascii("fork")), ReadFile(dst_));
    }
}

TEST_F(CopyAdoubleTest, AnExistingDestinationIsWrittenOverAndNotCut) {
    WriteFile(dst_, Repeat(0xEE, 100));
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), Ascii("fork"))));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), Ascii("fork")) + Repeat(0xEE, 14),
              ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, TheDestinationIsOpenToEverybody) {
    const Umask strict(077);
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), {})));
    EXPECT_EQ(0777, ModeOf(dst_));
    ASSERT_EQ(0, chmod(dst_.c_str(), 0600));
    EXPECT_EQ(0, Rewrite());
    EXPECT_EQ(0777, ModeOf(dst_));
}

TEST_F(CopyAdoubleTest, AForkIsCopiedInStepsOf16384Bytes) {
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), Pattern(40000, 1))));
    std::vector<std::string> calls = TakeCalls();
    EXPECT_THAT(calls, Contains("pread(16384, 112)"));
    EXPECT_THAT(calls, Contains("pread(16384, 16496)"));
    EXPECT_THAT(calls, Contains("pread(7232, 32880)"));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), Pattern(40000, 1)), ReadFile(dst_));
}

// ---- A fork that is left blank ------------------------------------------------------------------

// Promise: "AppleDouble: A fork that only says"
TEST_F(CopyAdoubleTest, ABlankForkBecomesNone) {
    EXPECT_EQ(0, Rewrite(MacSidecarWithBlankFork({{}, Pattern(32), {}}).bytes));
    EXPECT_EQ(Hex("00 05 16 07  00 02 00 00 'Mac OS X        ' 00 02"
                  "00 00 00 09  00 00 00 32  00 00 00 20"
                  "00 00 00 02  00 00 00 52  00 00 00 00") +
                  Pattern(32),
              ReadFile(dst_));
}

// Promise: "AppleDouble: A fork that only says"
TEST_F(CopyAdoubleTest, TheTextOfABlankForkCountsFrom63BytesOn) {
    const Bytes text = Ascii("This resource fork intentionally left blank   ");
    const Bytes shortest = Pattern(16) + text + Hex("00");
    ASSERT_EQ(63u, shortest.size());
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), shortest)));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), {}), ReadFile(dst_));

    // Whatever is behind it.
    unlink(dst_.c_str());
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), shortest + Pattern(20000))));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), {}), ReadFile(dst_));

    const Bytes too_short = Pattern(16) + text;
    unlink(dst_.c_str());
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), too_short)));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), too_short), ReadFile(dst_));
}

// Promise: "AppleDouble: A fork that only says"
TEST_F(CopyAdoubleTest, AForkThatDiffersFromTheBlankTextIsAFork) {
    for (const std::size_t at : {16u, 40u, 58u, 59u, 61u}) {
        SCOPED_TRACE(at);
        Bytes fork = BlankFork();
        fork[at] ^= 0x20;
        unlink(dst_.c_str());
        EXPECT_EQ(0, Rewrite(Spread(Pattern(32), fork)));
        EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), fork), ReadFile(dst_));
    }
    const Bytes moved = Bytes{0} + BlankFork();
    unlink(dst_.c_str());
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), moved)));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), moved), ReadFile(dst_));
}

// ---- Files that lie -----------------------------------------------------------------------------

TEST_F(CopyAdoubleTest, AForkThatEndsBeforeItsLengthIsCopiedAsFarAsItGoes) {
    for (const unsigned length : {5u, 20000u, 0x80000000u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(length);
        Bytes file = Spread(Pattern(32), Ascii("fork"));
        PutU32(file, kForkLengthAt, length);
        EXPECT_EQ(0, Rewrite(file));
        Bytes expected = Rewritten(file, Pattern(32), Ascii("fork"));
        PutU32(expected, kForkLengthAt, length);
        EXPECT_EQ(expected, ReadFile(dst_));
        EXPECT_THAT(TakeAllocations().largest, Lt(100000u));
    }
}

TEST_F(CopyAdoubleTest, AForkBeyondTheFileHasNoBytes) {
    for (const unsigned offset : {5000u, 0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(offset);
        Bytes file = Spread(Pattern(32), Repeat(1, 100));
        PutU32(file, kForkOffsetAt, offset);
        EXPECT_EQ(0, Rewrite(file));
        Bytes expected = Rewritten(file, Pattern(32), {});
        PutU32(expected, kForkLengthAt, 100);
        EXPECT_EQ(expected, ReadFile(dst_));
    }
}

TEST_F(CopyAdoubleTest, AForkThatReachesBeyond4GiBIsCopiedWhole) {
    constexpr std::uint32_t kAt = 0xFFFFFF00;
    const Bytes fork = Pattern(20000, 1);
    Bytes file = Spread(Pattern(32), fork);
    PutU32(file, kForkOffsetAt, kAt);
    WriteFile(src_, file);
    const int fd = open(src_.c_str(), O_WRONLY);
    const ssize_t wrote = pwrite(fd, fork.data(), fork.size(), off_t{kAt});
    close(fd);
    if (wrote != 20000) GTEST_SKIP() << "no files beyond 4 GiB: " << strerror(errno);
    EXPECT_EQ(0, Rewrite());
    EXPECT_EQ(Rewritten(file, Pattern(32), fork), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, AForkLiesWhereItsDescriptorSaysBehindAFinderInfoCutShort) {
    // The fork at 50, then the only 10 bytes of Finder info.
    EXPECT_EQ(0, Rewrite(Hex("00 05 16 07  00 02 00 00  00*16  00 02"
                             "00 00 00 09  00 00 00 36  00 00 00 20"
                             "00 00 00 02  00 00 00 32  00 00 00 04"
                             "'fork' 'TEXTttxt' 01 02")));
    EXPECT_EQ(Hex("00 05 16 07  00 02 00 00  00*16  00 02"
                  "00 00 00 09  00 00 00 32  00 00 00 20"
                  "00 00 00 02  00 00 00 52  00 00 00 04"
                  "'TEXTttxt' 01 02  00*22  'fork'"),
              ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, EntryCountsOtherThan2And13AreRefused) {
    for (const unsigned count : {0u, 1u, 3u, 4u, 12u, 14u, 15u, 255u, 0x0200u, 0x0D00u, 0xFFFFu}) {
        SCOPED_TRACE(count);
        Bytes file = Spread(Pattern(32), Pattern(900000, 1));
        PutU16(file, 24, count);
        WriteFile(dst_, Ascii("what was there before"));
        EXPECT_EQ(-5, Rewrite(file));
        EXPECT_FALSE(Exists(dst_));
    }
    TakeLog();
}

TEST_F(CopyAdoubleTest, ATableOfThreeEntriesIsRefusedAndLeavesNothing) {
    EXPECT_EQ(-5, Rewrite(PlainAppleDouble(Pattern(32), Ascii("fork"), 3)));
    EXPECT_FALSE(Exists(dst_));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(CopyAdoubleTest, ThirteenDescriptorsInAnyOrderAreTaken) {
    EXPECT_EQ(0, Rewrite(PlainAppleDouble(Pattern(32), Ascii("fork"), 13)));
    EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), Ascii("fork")), ReadFile(dst_));
    const Bytes fork_last = NetatalkFile(Pattern(32, 1), Ascii("last")).bytes;
    EXPECT_EQ(0, Rewrite(fork_last));
    EXPECT_EQ(Rewritten(fork_last, Pattern(32, 1), Ascii("last")), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, AMissingOrDoubledEntryIsRefused) {
    const struct {
        const char* what;
        std::uint32_t first, second;
    } tables[] = {
        {"no Finder info", 3, 2},   {"no fork", 9, 4},   {"neither", 3, 4},
        {"two Finder infos", 9, 9}, {"two forks", 2, 2},
    };
    for (const auto& [what, first, second] : tables) {
        SCOPED_TRACE(what);
        Bytes file = Spread(Pattern(32), Ascii("fork"));
        PutU32(file, kFinderIdAt, first);
        PutU32(file, kForkIdAt, second);
        EXPECT_EQ(-5, Rewrite(file));
        EXPECT_FALSE(Exists(dst_));
    }
    Bytes file = NetatalkFile(Pattern(32), Ascii("fork")).bytes;
    PutU32(file, 26, 9);
    EXPECT_EQ(-5, Rewrite(file));
    PutU32(file, 26, 2);
    EXPECT_EQ(-5, Rewrite(file));
    EXPECT_FALSE(Exists(dst_));
}

TEST_F(CopyAdoubleTest, AnEntryIdIsItsWhole32Bits) {
    Bytes file = Spread(Pattern(32), Ascii("fork"));
    PutU32(file, kForkIdAt, 0x00010002);
    EXPECT_EQ(-5, Rewrite(file));
    EXPECT_FALSE(Exists(dst_));
}

// ---- What there is nothing to do about ----------------------------------------------------------

TEST_F(CopyAdoubleTest, NullIsRefusedInEveryMode) {
    for (const int mode : kAllModes) {
        EXPECT_EQ(-1, EACopyAdoubleV2(nullptr, dst_.c_str(), mode));
        EXPECT_EQ(-1, EACopyAdoubleV2(src_.c_str(), nullptr, mode));
        EXPECT_EQ(-1, EACopyAdoubleV2(nullptr, nullptr, mode));
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
}

TEST_F(CopyAdoubleTest, AMissingOrEmptySourceIsDoneAtOnce) {
    EXPECT_EQ(0, Rewrite());
    EXPECT_EQ(0, Rewrite({}));
    EXPECT_FALSE(Exists(dst_));
    WriteFile(dst_, Ascii("before"));
    EXPECT_EQ(0, Rewrite());
    EXPECT_EQ(Ascii("before"), ReadFile(dst_));
    unlink(src_.c_str());
    EXPECT_EQ(0, Rewrite());
    EXPECT_EQ(Ascii("before"), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, ASourceThatIsGoneWhenOpenedAgainIsDone) {
    WriteFile(src_, Spread(Pattern(32), {}));
    const FailCall fault("open", ENOENT, 2);
    EXPECT_EQ(0, Rewrite());
    EXPECT_TRUE(fault.fired());
    EXPECT_FALSE(Exists(dst_));
}

TEST_F(CopyAdoubleTest, Version1IsRefusedAndNothingWritten) {
    Bytes file = Spread(Pattern(32), Ascii("fork"));
    PutU32(file, 4, 0x00010000);
    EXPECT_EQ(-1, Rewrite(file));
    ExpectLogged(" Apple double v1 doens't support now");
    EXPECT_FALSE(Exists(dst_));
    WriteFile(dst_, Ascii("before"));
    EXPECT_EQ(-1, Rewrite());
    ExpectLogged(" Apple double v1 doens't support now");
    EXPECT_EQ(Ascii("before"), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, OtherVersionsAreRefusedAndNothingWritten) {
    WriteFile(dst_, Ascii("before"));
    for (const unsigned version : {0u, 1u, 2u, 0x00020001u, 0x00030000u, 0x02000000u}) {
        SCOPED_TRACE(version);
        Bytes file = Spread(Pattern(32), Ascii("fork"));
        PutU32(file, 4, version);
        EXPECT_EQ(-1, Rewrite(file));
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_EQ(Ascii("before"), ReadFile(dst_));
    }
}

TEST_F(CopyAdoubleTest, ANamedPipeDoesNotKeepTheCallerWaiting) {
    ASSERT_EQ(0, mkfifo(src_.c_str(), 0666));
    WithoutWaiting([&] { EXPECT_THAT(Rewrite(), Le(0)); });
    EXPECT_FALSE(Exists(dst_));

    unlink(src_.c_str());
    WriteFile(src_, Spread(Pattern(32), Ascii("fork")));
    ASSERT_EQ(0, mkfifo(dst_.c_str(), 0666));
    WithoutWaiting([&] { EXPECT_THAT(Rewrite(), Lt(0)); });
}

// ---- Names --------------------------------------------------------------------------------------

class CopyAdoubleNamesTest : public CopyAdoubleTest {
 protected:
    CopyAdoubleNamesTest() : before_(open(".", O_RDONLY | O_DIRECTORY | O_CLOEXEC)) {
        if (before_ < 0 || chdir(dir_.path().c_str()) != 0) abort();
        WriteFile("src", Spread(Pattern(32), Ascii("fork")));
    }
    ~CopyAdoubleNamesTest() override {
        if (fchdir(before_) != 0) abort();
        close(before_);
    }

    static int Copy(const std::string& to, int mode) {
        return EACopyAdoubleV2("src", to.c_str(), mode);
    }

    int before_;
};

TEST_F(CopyAdoubleNamesTest, AnIconNameIsRefusedWhereNamesAreChecked) {
    for (const char* name : {"._Icon\r", "._ICON\r", "._icon\r", "._iCoN\r"}) {
        for (const int mode : {0, 3}) EXPECT_EQ(-32, Copy(name, mode));
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(NamesIn("."), ElementsAre("src"));
    for (const int mode : {1, 2}) EXPECT_EQ(0, Copy("._Icon\r", mode));
}

TEST_F(CopyAdoubleNamesTest, NamesThatOnlyResembleAnIconNameAreNone) {
    for (const int mode : {0, 3}) {
        for (const char* name : {"._Icon", "._Iconx", "._", "._.", "Icon\r", "_.Icon\r", ".a:b"}) {
            SCOPED_TRACE(name);
            EXPECT_EQ(0, Copy(name, mode));
            EXPECT_TRUE(Exists(name));
        }
        EXPECT_EQ(-33, Copy("._Icon\rx", mode));
        EXPECT_EQ(-33, Copy("._xIcon\r", mode));
    }
}

TEST_F(CopyAdoubleNamesTest, ReservedCharactersAreRefusedWhereNamesAreChecked) {
    for (const char c : std::string("\\/:*?\"><|\r\n")) {
        SCOPED_TRACE(static_cast<int>(c));
        TakeCallNames();
        for (const std::string& name : {std::string("._") + c, std::string("._a") + c + "b",
                                        std::string("._") + c + "b", std::string("._ab") + c}) {
            for (const int mode : {0, 3}) EXPECT_EQ(-33, Copy(name, mode));
        }
        EXPECT_THAT(TakeCallNames(), IsEmpty());
        if (c == '/') continue;
        for (const int mode : {1, 2}) {
            const std::string name = std::string("._") + std::to_string(mode) + c;
            EXPECT_EQ(0, Copy(name, mode));
            EXPECT_TRUE(Exists(name));
        }
    }
}

TEST_F(CopyAdoubleNamesTest, OtherCharactersAreTaken) {
    for (int c = 1; c < 256; ++c) {
        if (std::string("\\/:*?\"><|\r\n").find(static_cast<char>(c)) != std::string::npos)
            continue;
        SCOPED_TRACE(c);
        EXPECT_EQ(0, Copy(std::string("._") + static_cast<char>(c), 0));
    }
}

TEST_F(CopyAdoubleNamesTest, APathThatBeginsOtherwiseIsNotChecked) {
    for (const int mode : {0, 3}) {
        for (const std::string& path : {dir_ / "._Icon\r", dir_ / "._a:b",
                                        std::string("./._Icon\r"), std::string("./._a*")}) {
            SCOPED_TRACE(path);
            unlink(path.c_str());
            EXPECT_EQ(0, Copy(path, mode));
            EXPECT_TRUE(Exists(path));
        }
    }
}

TEST_F(CopyAdoubleNamesTest, ANameIsRefusedBeforeTheSourceIsLookedAt) {
    unlink("src");
    EXPECT_EQ(-32, Copy("._Icon\r", 0));
    EXPECT_EQ(-33, Copy("._a:b", 3));
    EXPECT_EQ(0, Copy("._ab", 0));
}

// ---- Copies by another program ------------------------------------------------------------------

class CopyAdoubleByProgramTest : public CopyAdoubleNamesTest {
 protected:
    // Enough "./" in front of `name` that the path has `size` bytes.
    static std::string Padded(const std::string& name, std::size_t size) {
        std::string path = (size - name.size()) % 2 == 0 ? "" : ".//";
        while (path.size() + name.size() < size) path += "./";
        return path + name;
    }
};

TEST_F(CopyAdoubleByProgramTest, TheCommandIsCpWithBothPathsQuoted) {
    for (const int mode : {2, 3}) {
        unlink("dst");
        EXPECT_EQ(0, Copy("dst", mode));
        EXPECT_THAT(TakeCalls(), ElementsAre("lstat(src)", "lstat(dst)",
                                             "system(/bin/cp -f 'src' 'dst' > /dev/null 2>&1)"));
        EXPECT_EQ(ReadFile("src"), ReadFile("dst"));
    }
}

TEST_F(CopyAdoubleByProgramTest, WhateverTheFileIsItIsCopiedAsItIs) {
    const Bytes files[] = {{}, Ascii("no AppleDouble"), Pattern(100000)};
    for (const int mode : {2, 3}) {
        for (const Bytes& file : files) {
            WriteFile("src", file);
            WriteFile("dst", Repeat(0xEE, 200));
            EXPECT_EQ(0, Copy("dst", mode));
            EXPECT_EQ(file, ReadFile("dst"));
        }
    }
}

TEST_F(CopyAdoubleByProgramTest, AFailedCopyIsRefused) {
    for (const int mode : {2, 3}) {
        EXPECT_EQ(-1, EACopyAdoubleV2("missing", "dst", mode));
        EXPECT_EQ(-1, Copy("missing/dst", mode));
        const FailCall fault("system", EAGAIN);
        EXPECT_EQ(-1, Copy("dst", mode));
    }
    EXPECT_FALSE(Exists("dst"));
}

TEST_F(CopyAdoubleByProgramTest, NothingInAPathIsRun) {
    const std::string names[] = {
        "it's",
        "'",
        "''",
        "'; touch run; '",
        "' && touch run '",
        "\"; touch run; \"",
        "two words",
        " ",
        "$(touch run)",
        "`touch run`",
        "$HOME",
        "${IFS}x",
        "a\nb",
        "\n touch run\n",
        "a;touch run",
        "a|touch run",
        "a&touch run",
        "a>run",
        "*",
        "?",
        "[a]",
        "~",
        "#",
        "!",
        "\\",
        "a\\",
        "\\'; touch run; \\'",
        "%s%n",
        "-",
        "-r",
        "-t",
        "--help",
        "--version",
        "--",
        "-'; touch run; '",
        "\xFF\xC3\x28",
        "\x01\x7F\t\r",
    };
    const Bytes content = Ascii("the file");
    for (const std::string& name : names) {
        SCOPED_TRACE(name);
        const std::string other = name + "2";
        WriteFile(name, content);
        EXPECT_EQ(0, EACopyAdoubleV2(name.c_str(), other.c_str(), 2));
        ASSERT_TRUE(Exists(other));
        EXPECT_EQ(content, ReadFile(other));
        unlink(name.c_str());
        EXPECT_EQ(0, EACopyAdoubleV2(other.c_str(), name.c_str(), 3));
        ASSERT_TRUE(Exists(name));
        EXPECT_EQ(content, ReadFile(name));
        unlink(name.c_str());
        unlink(other.c_str());
        EXPECT_THAT(NamesIn("."), ElementsAre("src"));
    }
}

TEST_F(CopyAdoubleByProgramTest, NothingInAPathOfFoldersIsRun) {
    const std::string folder = "'$(touch run)' -x\n";
    ASSERT_EQ(0, mkdir(folder.c_str(), 0777));
    const std::string to = dir_ / folder + "/it's";
    EXPECT_EQ(0, EACopyAdoubleV2((dir_ / "src").c_str(), to.c_str(), 2));
    EXPECT_EQ(ReadFile("src"), ReadFile(to));
    EXPECT_THAT(NamesIn("."), ElementsAre(folder, "src"));
}

TEST_F(CopyAdoubleByProgramTest, ACommandThatDoesNotFit4096BytesIsNotRun) {
    const std::size_t around = strlen("/bin/cp -f '' '' > /dev/null 2>&1");
    const std::size_t first = 2000;
    const std::string from = Padded("src", first);
    const std::string longest = Padded("dst", 4095 - around - first);
    EXPECT_EQ(0, EACopyAdoubleV2(from.c_str(), longest.c_str(), 2));
    EXPECT_EQ(ReadFile("src"), ReadFile("dst"));
    TakeCalls();
    unlink("dst");
    for (const std::size_t more : {1u, 2u, 100u, 1000u}) {
        const std::string path = Padded("dst", longest.size() + more);
        EXPECT_EQ(-1, EACopyAdoubleV2(from.c_str(), path.c_str(), 2));
        EXPECT_EQ(-1, EACopyAdoubleV2(from.c_str(), path.c_str(), 3));
    }
    // Nor one whose quotes are too many.
    const std::string quotes(1200, '\'');
    EXPECT_EQ(-1, EACopyAdoubleV2("src", quotes.c_str(), 2));
    EXPECT_EQ(-1, EACopyAdoubleV2(quotes.c_str(), "dst", 2));
    EXPECT_EQ(-1, EACopyAdoubleV2(std::string(100000, 'x').c_str(), "dst", 2));
    EXPECT_THAT(TakeCallNames(), Not(Contains("system")));
    EXPECT_THAT(NamesIn("."), ElementsAre("src"));
}

// ---- Failures -----------------------------------------------------------------------------------

TEST_F(CopyAdoubleTest, ASourceThatCannotBeOpenedIsLogged) {
    WriteFile(src_, Spread(Pattern(32), {}));
    WriteFile(dst_, Ascii("before"));
    {
        const FailCall fault("open", EACCES, 1);
        EXPECT_EQ(-2, Rewrite());
    }
    ExpectLogged(" failed to open " + src_ + ", reason=Permission denied.");
    {
        const FailCall fault("open", EMFILE, 2);
        EXPECT_EQ(-2, Rewrite());
    }
    ExpectLogged("(EACopyAdoubleV2) failed to open " + src_ + ", reason=Too many open files.");
    EXPECT_EQ(Ascii("before"), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, ASourceBelowAFileCannotBeOpened) {
    WriteFile(src_, Ascii("no folder"));
    const std::string below = src_ + "/below";
    EXPECT_EQ(-2, EACopyAdoubleV2(below.c_str(), dst_.c_str(), 0));
    ExpectLogged(" failed to open " + below + ", reason=Not a directory.");
}

TEST_F(CopyAdoubleTest, ADestinationThatCannotBeOpenedIsLoggedAndLeft) {
    WriteFile(src_, Spread(Pattern(32), {}));
    WriteFile(dst_, Ascii("before"));
    for (const int error : {EACCES, ENOENT}) {
        const FailCall fault("open", error, 3);
        EXPECT_EQ(-2, Rewrite());
        ExpectLogged("(EACopyAdoubleV2) failed to open " + dst_ + ", reason=" + strerror(error) +
                     ".");
    }
    EXPECT_EQ(Ascii("before"), ReadFile(dst_));
    EXPECT_EQ(-2, EACopyAdoubleV2(src_.c_str(), dir_.path().c_str(), 1));
    ExpectLogged("(EACopyAdoubleV2) failed to open " + dir_.path() + ", reason=Is a directory.");
    const std::string nowhere = dir_ / "missing/dst";
    EXPECT_EQ(-2, EACopyAdoubleV2(src_.c_str(), nowhere.c_str(), 1));
    ExpectLogged("(EACopyAdoubleV2) failed to open " + nowhere +
                 ", reason=No such file or directory.");
}

TEST_F(CopyAdoubleTest, TheDestinationIsOpenedForWritingAndNotCut) {
    EXPECT_EQ(0, Rewrite(Spread(Pattern(32), {})));
    const auto opens = TakeCallsOf("open");
    ASSERT_EQ(3u, opens.size());
    EXPECT_THAT(opens[0], StartsWith("open(" + src_ + ", O_RDONLY"));
    EXPECT_THAT(opens[1], StartsWith("open(" + src_ + ", O_RDONLY"));
    EXPECT_THAT(opens[2], StartsWith("open(" + dst_ + ", O_WRONLY|O_CREAT"));
    EXPECT_THAT(opens[2], AllOf(Not(HasSubstr("O_TRUNC")), Not(HasSubstr("O_EXCL"))));
}

TEST_F(CopyAdoubleTest, Descriptor0CountsAsAFailedOpenAndIsNotLeaked) {
    WriteFile(src_, Spread(Pattern(32), {}));
    {
        const FreedDescriptor standard_input(0);
        EXPECT_EQ(-2, Rewrite());
        EXPECT_FALSE(standard_input.taken());
    }
    EXPECT_FALSE(Exists(dst_));
    ExpectLoggedBegin(" failed to open " + src_ + ", reason=");
}

TEST_F(CopyAdoubleTest, Descriptor1IsAsGoodAsAnyOther) {
    WriteFile(src_, Spread(Pattern(32), {}));
    const FreedDescriptor standard_output(1);
    EXPECT_EQ(0, Rewrite());
    EXPECT_TRUE(Exists(dst_));
}

TEST_F(CopyAdoubleTest, AFileShorterThanItsHeaderCannotBeRead) {
    WriteFile(dst_, Ascii("before"));
    const Bytes whole = Spread(Pattern(32), {});
    for (const std::size_t size : {1u, 4u, 24u, 25u}) {
        EXPECT_EQ(-5, Rewrite(Slice(whole, 0, size)));
        ExpectLoggedBegin(" failed to read " + src_ + ", reason=");
    }
    EXPECT_EQ(Ascii("before"), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, AFileShorterThanItsTableCannotBeRead) {
    const Bytes whole = Spread(Pattern(32), {});
    for (const std::size_t size : {26u, 37u, 38u, 49u}) {
        WriteFile(dst_, Ascii("before"));
        EXPECT_EQ(-5, Rewrite(Slice(whole, 0, size)));
        ExpectLoggedBegin("(EACopyAdoubleV2) failed to read " + src_ + ", reason=");
        EXPECT_FALSE(Exists(dst_));
    }
}

TEST_F(CopyAdoubleTest, ASourceThatCannotBeReadIsLoggedAtOnce) {
    WriteFile(src_, Spread(Pattern(32), {}));
    WriteFile(dst_, Ascii("before"));
    for (const auto& [error, result] : {std::pair{EIO, -13}, {EACCES, -5}, {ENOSPC, -5}}) {
        const FailCall fault("pread", error, 1);
        EXPECT_EQ(result, Rewrite());
        ExpectLogged(" failed to read " + src_ + ", reason=" + strerror(error) + ".");
    }
    EXPECT_EQ(Ascii("before"), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, EveryFailedReadHasItsLineAndResult) {
    // The fork takes three reads; it does not begin as a blank one is told, so that each read of
    // the descriptors can be told too.
    const Bytes file = Spread(Pattern(32), Pattern(40000, 1));
    const std::string of_areas =
        "(EACopyAdoubleV2) failed to read " + src_ + ", cRead=-1, cToRead=";
    for (const auto& [error, result] : {std::pair{EIO, -13}, {EACCES, -5}, {ENOSPC, -5}}) {
        const std::string reason = std::string("reason=") + strerror(error) + ".";
        std::vector<std::string> lines;
        for (int nth = 2;; ++nth) {
            unlink(dst_.c_str());
            WriteFile(src_, file);
            const FailCall fault("pread", error, nth);
            const int got = Rewrite();
            if (!fault.fired()) break;
            const std::vector<std::string> log = TakeLog();
            if (log.empty()) {  // Whether the fork is a blank one could not be read.
                EXPECT_EQ(0, got);
                continue;
            }
            ASSERT_EQ(1u, log.size());
            lines.push_back(log[0]);
            if (log[0].find("EAGetEntriesBuf") != std::string::npos) {
                EXPECT_EQ(0, got);
                continue;
            }
            EXPECT_EQ(result, got) << log[0];
            EXPECT_FALSE(Exists(dst_));
        }
        const std::string head =
            "ea_copy.c:LINE(EACopyAdoubleV2) failed to read " + src_ + ", " + reason;
        const std::string again = "ea_copy.c:LINE(EAGetEntriesBuf) failed to read, " + reason;
        EXPECT_THAT(lines, ElementsAre(head, head, again, again,
                                       "ea_copy.c:LINE" + of_areas + "32, " + reason,
                                       "ea_copy.c:LINE" + of_areas + "16384, " + reason,
                                       "ea_copy.c:LINE" + of_areas + "16384, " + reason,
                                       "ea_copy.c:LINE" + of_areas + "7232, " + reason));
    }
}

TEST_F(CopyAdoubleTest, WithoutASecondLookAtTheTableTheEntriesAreWhereARewrittenFileHasThem) {
    const Bytes file = Spread(Pattern(32, 1), Pattern(60, 2));
    int looks = 0;
    for (int nth = 2;; ++nth) {
        unlink(dst_.c_str());
        WriteFile(src_, file);
        const FailCall fault("pread", EACCES, nth);
        const int got = Rewrite();
        if (!fault.fired()) break;
        const std::vector<std::string> log = TakeLog();
        if (log != std::vector<std::string>{
                       "ea_copy.c:LINE(EAGetEntriesBuf) failed to read, reason=Permission "
                       "denied."}) {
            continue;
        }
        ++looks;
        EXPECT_EQ(0, got);
        EXPECT_EQ(Rewritten(file, Slice(file, 50, 32), Slice(file, 82, 60)), ReadFile(dst_));
    }
    EXPECT_EQ(2, looks);  // header and table
}

TEST_F(CopyAdoubleTest, ASecondLookThatComesBackShortIsAFailedOne) {
    const Bytes file = Spread(Pattern(32, 1), Pattern(60, 2));
    WriteFile(src_, file);
    const ShortCall fault("pread", 4, 0, true);  // behind three of header, header, table
    EXPECT_EQ(0, Rewrite());
    ExpectLoggedBegin("(EAGetEntriesBuf) failed to read, reason=");
    EXPECT_EQ(Rewritten(file, Slice(file, 50, 32), Slice(file, 82, 60)), ReadFile(dst_));
}

TEST_F(CopyAdoubleTest, EveryFailedWriteHasItsLineAndResult) {
    const Bytes file = Spread(Pattern(32), Pattern(40000, 1));
    for (const auto& [error, result] :
         {std::pair{EIO, -13}, {ENOSPC, -9}, {EFBIG, -5}, {EACCES, -5}}) {
        int head = 0;
        int areas = 0;
        for (int nth = 1;; ++nth) {
            WriteFile(src_, file);
            WriteFile(dst_, Ascii("before"));
            TakeCalls();
            const FailCall fault("pwrite", error, nth);
            const int got = Rewrite();
            if (!fault.fired()) break;
            EXPECT_EQ(result, got);
            EXPECT_FALSE(Exists(dst_));
            const std::vector<std::string> writes = TakeCallsOf("pwrite");
            const std::string& last = writes.back();
            const bool in_head = std::stoul(last.substr(last.find(", ") + 2)) < 50;
            ++(in_head ? head : areas);
            ExpectLogged(std::string("(EACopyAdoubleV2) failed to write ") +
                         (in_head ? "to " : "") + dst_ + ", reason=" + strerror(error) + ".");
        }
        EXPECT_THAT(head, ::testing::Ge(1));
        EXPECT_THAT(areas, ::testing::Ge(3));
    }
}

// Of head, what there is of Finder info, what is missing of it, and fork.
TEST_F(CopyAdoubleTest, AFailedWriteOfWhatAFinderInfoLacksIsAFailureToo) {
    const Bytes file =
        Hex("00 05 16 07  00 02 00 00  00*16  00 02"
            "00 00 00 09  00 00 00 36  00 00 00 20"
            "00 00 00 02  00 00 00 32  00 00 00 04"
            "'fork' 'TEXTttxt' 01 02");
    int failed = 0;
    for (int nth = 1;; ++nth) {
        WriteFile(src_, file);
        const FailCall fault("pwrite", ENOSPC, nth);
        const int got = Rewrite();
        if (!fault.fired()) break;
        ++failed;
        EXPECT_EQ(-9, got);
        EXPECT_FALSE(Exists(dst_));
        EXPECT_THAT(TakeLog(), ElementsAre(HasSubstr("(EACopyAdoubleV2) failed to write ")));
    }
    EXPECT_LE(4, failed);
}

TEST_F(CopyAdoubleTest, AWriteThatStopsShortIsAFailure) {
    for (int nth = 1;; ++nth) {
        unlink(dst_.c_str());
        WriteFile(src_, Spread(Pattern(32), Pattern(20000, 1)));
        const ShortCall fault("pwrite", nth, 3);
        const int got = Rewrite();
        if (!fault.fired()) break;
        EXPECT_THAT(got, AnyOf(-13, -9, -5));
        EXPECT_FALSE(Exists(dst_));
        EXPECT_THAT(TakeLog(), ElementsAre(HasSubstr("(EACopyAdoubleV2) failed to write ")));
    }
}

TEST_F(CopyAdoubleTest, ReadsAndWritesInPiecesAreGoneOnWith) {
    const Bytes fork = Pattern(20000, 1);
    for (const char* name : {"pread", "pwrite"}) {
        int pieces = 0;
        for (int nth = 1;; ++nth) {
            unlink(dst_.c_str());
            WriteFile(src_, Spread(Pattern(32), fork));
            const ShortCall fault(name, nth, 3, true);
            EXPECT_EQ(0, Rewrite());
            if (!fault.fired()) break;
            ++pieces;
            EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), fork), ReadFile(dst_));
        }
        EXPECT_THAT(pieces, ::testing::Ge(4)) << name;
    }
}

TEST_F(CopyAdoubleTest, InterruptedReadsAndWritesAreRepeated) {
    for (const char* name : {"pread", "pwrite"}) {
        for (int nth = 1;; ++nth) {
            unlink(dst_.c_str());
            WriteFile(src_, Spread(Pattern(32), Ascii("fork")));
            const FailCall fault(name, EINTR, nth);
            EXPECT_EQ(0, Rewrite());
            if (!fault.fired()) break;
            EXPECT_EQ(Rewritten(ReadFile(src_), Pattern(32), Ascii("fork")), ReadFile(dst_));
        }
    }
}

TEST_F(CopyAdoubleTest, AFailedSeekIsAnIoError) {
    for (const int nth : {1, 2}) {
        for (const int error : {EINVAL, EIO, ESPIPE}) {
            WriteFile(src_, Spread(Pattern(32), Ascii("fork")));
            WriteFile(dst_, Ascii("before"));
            const FailCall fault("lseek", error, nth);
            EXPECT_EQ(-13, Rewrite());
            EXPECT_TRUE(fault.fired());
            EXPECT_FALSE(Exists(dst_));
        }
    }
}

TEST_F(CopyAdoubleTest, AModeThatCannotBeSetIsAFailure) {
    for (const auto& [error, result] : {std::pair{EPERM, -14}, {ENOSPC, -14}, {EIO, -13}}) {
        WriteFile(src_, Spread(Pattern(32), Ascii("fork")));
        const FailCall fault("fchmod", error);
        EXPECT_EQ(result, Rewrite());
        EXPECT_EQ(error, errno);
        EXPECT_TRUE(fault.fired());
        EXPECT_FALSE(Exists(dst_));
    }
}

TEST_F(CopyAdoubleTest, ADestinationIsClosedAndThenRemovedAndTheReasonStaysInErrno) {
    WriteFile(src_, Spread(Pattern(32), Ascii("fork")));
    // Its removal finds it gone and has a reason of its own.
    Hooks().before = [this](const std::string& name) {
        if (name == "unlink") unlink(dst_.c_str());
    };
    TakeCallNames();
    const FailCall fault("fchmod", EPERM);
    EXPECT_EQ(-14, Rewrite());
    EXPECT_EQ(EPERM, errno);
    const std::vector<std::string> calls = TakeCallNames();
    const auto removed = std::ranges::find(calls, "unlink");
    ASSERT_NE(calls.end(), removed);
    EXPECT_EQ("close", *std::prev(removed));
}

TEST_F(CopyAdoubleTest, ADestinationThatWasOpenedIsGoneAfterWhateverFails) {
    const Bytes file = Spread(Pattern(32), Pattern(20000, 1));
    for (const int error : {EIO, ENOSPC, EACCES}) {
        for (int nth = 1;; ++nth) {
            SCOPED_TRACE(nth);
            WriteFile(src_, file);
            WriteFile(dst_, Ascii("before"));
            TakeCalls();
            const FailNthCall fault(nth, error);
            const int got = Rewrite();
            if (!fault.fired()) break;
            const bool opened = TakeCallsOf("open").size() == 3 && fault.name() != "open";
            if (got == 0) {
                ASSERT_TRUE(Exists(dst_)) << fault.name();
                EXPECT_NE(Ascii("before"), ReadFile(dst_));
            } else if (!opened) {
                EXPECT_EQ(Ascii("before"), ReadFile(dst_)) << fault.name();
            } else {
                EXPECT_FALSE(Exists(dst_)) << fault.name();
            }
            EXPECT_EQ(file, ReadFile(src_));
            TakeLog();
        }
    }
}

// ---- Files of other programs --------------------------------------------------------------------

TEST_F(CopyAdoubleTest, SampleFilesKeepFinderInfoAndFork) {
    const std::vector<SampleFile> samples = SampleFiles();
    if (samples.empty()) GTEST_SKIP() << kNoSampleFiles;
    int rewritten = 0;
    for (const SampleFile& sample : samples) {
        SCOPED_TRACE(sample.name);
        unlink(dst_.c_str());
        const int got = Rewrite(sample.bytes);
        EXPECT_EQ(sample.bytes, ReadFile(src_));
        if (!sample.contents) {
            // What is no AppleDouble has no version or no table to go by.
            EXPECT_THAT(got, Lt(0));
            EXPECT_FALSE(Exists(dst_));
            continue;
        }
        const unsigned count = U16At(sample.bytes, 24);
        if (count != 2 && count != 13) {
            EXPECT_EQ(-5, got);
            EXPECT_FALSE(Exists(dst_));
            continue;
        }
        EXPECT_EQ(0, got);
        const MacFile file = {sample.name, sample.bytes, *sample.contents};
        EXPECT_EQ(Rewritten(sample.bytes, file.contents.finder_info, file.ForkInUse(),
                            U32At(sample.bytes, 26) == 2),
                  ReadFile(dst_));
        ++rewritten;
    }
    EXPECT_THAT(rewritten, ::testing::Ge(1));
    TakeLog();
}

}  // namespace
}  // namespace mavoea::test

// Named attributes: enumerate, get, set and remove over the file's own extended attributes.

#include <errno.h>
#include <limits.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <map>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/process.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

std::string InvalidArgument(const std::string& unit, const std::string& check) {
    return unit + ":LINE Invaild Argument (" + check + ")=[0]";
}

// What the functions share: an object without attributes, and that nothing stays behind.
class XattrTest : public ::testing::Test {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        WriteFile(object_, Ascii("data"));
        live_blocks_ = TakeAllocations().live;
    }

    void TearDown() override {
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        ResetKernel();
        ResetPlatform();
    }

    static void ExpectCheckFailed(const std::string& unit, const std::string& check) {
        EXPECT_THAT(TakeLog(), ElementsAre(InvalidArgument(unit, check)));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, unit)));
        EXPECT_THAT(TakeCallNames(), IsEmpty());
    }

    bool KeepsUserAttributes() const {
        if (setxattr(object_.c_str(), "user.probe", "", 0, 0) != 0) return false;
        return removexattr(object_.c_str(), "user.probe") == 0;
    }

    void Put(const std::string& name, const std::string& value) const {
        ASSERT_EQ(0, setxattr(object_.c_str(), name.c_str(), value.data(), value.size(), 0))
            << strerror(errno);
    }

    std::string ValueOf(const std::string& name) const {
        char value[4096];
        const ssize_t size = getxattr(object_.c_str(), name.c_str(), value, sizeof value);
        return size < 0 ? std::string("(") + strerror(errno) + ")"
                        : std::string(value, static_cast<size_t>(size));
    }

    TempDir dir_;
    const std::string object_ = dir_ / "object";
    const std::string missing_ = dir_ / "missing";
    int live_blocks_ = 0;
};

// The same, for tests that need a filesystem with "user." attributes.
class RealXattrTest : public XattrTest {
 protected:
    void SetUp() override {
        XattrTest::SetUp();
        if (!KeepsUserAttributes()) {
            GTEST_SKIP() << "the filesystem of " << dir_.path() << " has no user attributes";
        }
    }
};

// A list that is freed at the end of its scope.
class List {
 public:
    explicit List(const std::vector<std::string>& strings = {}) : list_(NewList(strings)) {}
    ~List() { MLIBCSzListFree(list_); }
    List(const List&) = delete;
    List& operator=(const List&) = delete;

    MLIBCSzList** out() { return &list_; }
    std::vector<std::string> strings() const { return Strings(list_); }

 private:
    MLIBCSzList* list_;
};

// ---- Enumerate ------------------------------------------------------------------------------

class XattrEnumTest : public XattrTest {
 protected:
    // Stands in for a file whose attribute names are these.
    static void OfferNames(const std::string& names) {
        Hooks().listxattr = [names](const char*, char* buffer, size_t size) -> ssize_t {
            if (size == 0) return static_cast<ssize_t>(names.size());
            if (size < names.size()) {
                errno = ERANGE;
                return -1;
            }
            memcpy(buffer, names.data(), names.size());
            return static_cast<ssize_t>(names.size());
        };
    }
};
using RealXattrEnumTest = RealXattrTest;

// Promise: "MAVOEAXattrEnum: -1: 0xD00"
TEST_F(XattrEnumTest, ANullPathIsLoggedAndRecorded) {
    List list({"before"});
    EXPECT_EQ(-1, MAVOEAXattrEnum(nullptr, list.out()));
    ExpectCheckFailed("ea_xattr_enum", "((void *)0) != szPath");
    EXPECT_THAT(list.strings(), ElementsAre("before"));
}

// Promise: "MAVOEAXattrEnum: -1: 0xD00"
TEST_F(XattrEnumTest, ANullListPointerIsLoggedAndRecorded) {
    EXPECT_EQ(-1, MAVOEAXattrEnum(object_.c_str(), nullptr));
    ExpectCheckFailed("ea_xattr_enum", "((void *)0) != ppList");
}

TEST_F(XattrEnumTest, ANullListIsLoggedAndRecorded) {
    MLIBCSzList* none = nullptr;
    EXPECT_EQ(-1, MAVOEAXattrEnum(object_.c_str(), &none));
    ExpectCheckFailed("ea_xattr_enum", "NULL != *ppList");
    EXPECT_EQ(nullptr, none);
}

TEST_F(XattrEnumTest, ThePathIsCheckedFirst) {
    EXPECT_EQ(-1, MAVOEAXattrEnum(nullptr, nullptr));
    ExpectCheckFailed("ea_xattr_enum", "((void *)0) != szPath");
}

// Promise: "MAVOEAXattrEnum: Appends"
TEST_F(RealXattrEnumTest, NamesAreAppendedToWhatTheListHolds) {
    Put("user.first", "1");
    Put("user.second", "2");
    List list({"before"});
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    const auto names = list.strings();
    ASSERT_FALSE(names.empty());
    EXPECT_EQ("before", names.front());
    // Security modules may add names of their own.
    EXPECT_THAT(names, AllOf(Contains("user.first"), Contains("user.second")));
    ExpectNothingReported();
}

TEST_F(RealXattrEnumTest, NamesThatSetfattrWroteAreFound) {
    if (!HasProgram("setfattr")) GTEST_SKIP() << "setfattr is not installed (package attr)";
    ASSERT_EQ(0, RunProgram("setfattr -n user.by.setfattr -v text " + Quoted(object_)).status);
    List list;
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), Contains("user.by.setfattr"));
}

// Promise: "Named attributes: symbolic links"
TEST_F(RealXattrEnumTest, SymbolicLinksAreFollowed) {
    Put("user.of.target", "x");
    const std::string link = dir_ / "link";
    ASSERT_EQ(0, symlink(object_.c_str(), link.c_str()));
    List list;
    EXPECT_EQ(0, MAVOEAXattrEnum(link.c_str(), list.out()));
    EXPECT_THAT(list.strings(), Contains("user.of.target"));
}

TEST_F(RealXattrEnumTest, ADirectoryHasNamesToo) {
    const std::string directory = dir_ / "directory";
    ASSERT_EQ(0, mkdir(directory.c_str(), 0755));
    ASSERT_EQ(0, setxattr(directory.c_str(), "user.of.directory", "x", 1, 0));
    List list;
    EXPECT_EQ(0, MAVOEAXattrEnum(directory.c_str(), list.out()));
    EXPECT_THAT(list.strings(), Contains("user.of.directory"));
}

TEST_F(XattrEnumTest, NamesComeInTheKernelsOrderAndNoneIsFilteredOrAdded) {
    using namespace std::string_literals;
    OfferNames("user.z\0com.apple.FinderInfo\0a\0security.selinux\0trusted.x\0"s);
    List list;
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), ElementsAre("user.z", "com.apple.FinderInfo", "a",
                                            "security.selinux", "trusted.x"));
    ExpectNothingReported();
}

TEST_F(XattrEnumTest, TheSizeIsAskedForFirstAndABufferOfThatSizeFilled) {
    using namespace std::string_literals;
    OfferNames("user.a\0user.bc\0"s);
    List list;
    TakeCalls();
    TakeAllocations();
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(TakeCalls(),
                ElementsAre("listxattr(" + object_ + ", 0)", "listxattr(" + object_ + ", 15)"));
    const Allocations allocations = TakeAllocations();
    EXPECT_EQ(15u, allocations.largest);
    EXPECT_EQ(15u, allocations.total);
}

// Promise: "MAVOEAXattrEnum: empties it"
TEST_F(XattrEnumTest, AFileWithoutAttributesEmptiesTheList) {
    OfferNames("");
    List list({"one", "two"});
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), IsEmpty());
    EXPECT_THAT(TakeCallNames(), ElementsAre("listxattr"));
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrEnum: empties it"
TEST_F(XattrEnumTest, AMissingFileEmptiesTheListAndIsNoFailure) {
    List list({"one"});
    EXPECT_EQ(0, MAVOEAXattrEnum(missing_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), IsEmpty());
    ExpectNothingReported();
}

TEST_F(XattrEnumTest, MissingAttributesEmptyTheListAndAreNoFailure) {
    List list({"one"});
    const FailCall fault("listxattr", ENODATA);
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), IsEmpty());
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrEnum: 0x2A00"
TEST_F(XattrEnumTest, AnyOtherFailureToAskForTheSizeIsRecordedAndLeavesTheList) {
    for (const int error : {ENOTSUP, EACCES, EIO, ENOTDIR, ELOOP, ENAMETOOLONG, ERANGE}) {
        SCOPED_TRACE(strerror(error));
        List list({"one"});
        const FailCall fault("listxattr", error);
        errno = 0;
        EXPECT_EQ(-1, MAVOEAXattrEnum(object_.c_str(), list.out()));
        EXPECT_EQ(error, errno);
        EXPECT_THAT(list.strings(), ElementsAre("one"));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_xattr_enum")));
        EXPECT_THAT(TakeLog(), IsEmpty());
    }
}

// Promise: "MAVOEAXattrEnum: 0x2A00"
TEST_F(XattrEnumTest, AnyFailureToReadTheNamesIsRecordedAndLeavesTheList) {
    using namespace std::string_literals;
    OfferNames("user.a\0"s);
    // ENOENT and ENODATA too: only the first call may find nothing.
    for (const int error : {ERANGE, ENOENT, ENODATA, EIO}) {
        SCOPED_TRACE(strerror(error));
        List list({"one"});
        const FailCall fault("listxattr", error, 2);
        errno = 0;
        EXPECT_EQ(-1, MAVOEAXattrEnum(object_.c_str(), list.out()));
        EXPECT_TRUE(fault.fired());
        EXPECT_EQ(error, errno);
        EXPECT_THAT(list.strings(), ElementsAre("one"));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_xattr_enum")));
        EXPECT_THAT(TakeLog(), IsEmpty());
    }
}

// Promise: "MAVOEAXattrEnum: 0x100"
TEST_F(XattrEnumTest, LackOfMemoryForTheNamesIsRecordedAndLeavesTheList) {
    using namespace std::string_literals;
    OfferNames("user.a\0"s);
    List list({"one"});
    const FailCall fault("malloc", ENOMEM);
    EXPECT_EQ(-1, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(list.strings(), ElementsAre("one"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x100, "ea_xattr_enum")));
    EXPECT_THAT(TakeCallNames(), ElementsAre("listxattr"));
}

// Promise: "mavoea.h: Results."
TEST_F(XattrEnumTest, EveryFailingCallIsRecordedOnceAndLeavesNothingBehind) {
    using namespace std::string_literals;
    OfferNames("user.a\0user.b\0"s);
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        ASSERT_LT(nth, 50);
        List list;
        const FailNthCall fault(nth, EIO);
        const int result = MAVOEAXattrEnum(object_.c_str(), list.out());
        if (!fault.fired()) {
            EXPECT_EQ(0, result);
            EXPECT_THAT(list.strings(), ElementsAre("user.a", "user.b"));
            EXPECT_EQ(4, nth);  // size, buffer, names
            return;
        }
        EXPECT_EQ(-1, result);
        EXPECT_THAT(list.strings(), IsEmpty());
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(fault.name() == "malloc" ? 0x100 : 0x2A00,
                                                        "ea_xattr_enum")));
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
    }
}

// Promise: "MAVOEAXattrEnum: or, with no code"
TEST_F(XattrEnumTest, AListThatTakesNoMoreEndsTheWalk) {
    using namespace std::string_literals;
    OfferNames("user.a\0user.b\0user.c\0"s);
    for (int taken = 0; taken < 3; ++taken) {
        SCOPED_TRACE(taken);
        List list({"before"});
        Platform().pushes_until_failure = taken;
        EXPECT_EQ(-1, MAVOEAXattrEnum(object_.c_str(), list.out()));
        const std::vector<std::string> all = {"before", "user.a", "user.b"};
        EXPECT_EQ(std::vector<std::string>(all.begin(), all.begin() + 1 + taken), list.strings());
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        ExpectNothingReported();
    }
}

TEST_F(XattrEnumTest, NamesThatVanishBetweenTheTwoCallsAreNotListed) {
    using namespace std::string_literals;
    Hooks().listxattr = [](const char*, char* buffer, size_t size) -> ssize_t {
        if (size == 0) return 14;  // two names, of which one is removed
        memcpy(buffer, "user.b", 7);
        return 7;
    };
    List list;
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), ElementsAre("user.b"));
}

TEST_F(XattrEnumTest, NoneMayBeLeftAtTheSecondCall) {
    Hooks().listxattr = [](const char*, char*, size_t size) -> ssize_t {
        return size == 0 ? 7 : 0;
    };
    List list;
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), IsEmpty());
    ExpectNothingReported();
}

TEST_F(XattrEnumTest, TheResourceForkIsNotListed) {
    OfferNames("");
    Hooks().stat = [this](const char*, struct stat* info) { return ::stat(object_.c_str(), info); };
    List list;
    EXPECT_EQ(0, MAVOEAXattrEnum(object_.c_str(), list.out()));
    EXPECT_THAT(list.strings(), IsEmpty());
}

// ---- Get ------------------------------------------------------------------------------------

using XattrGetTest = XattrTest;
using RealXattrGetTest = RealXattrTest;

// Promise: "Named attributes: NULL and negative"
// Promise: "MAVOEAXattrGet: -1: 0xD00"
TEST_F(XattrGetTest, ANullPathIsLoggedAndRecorded) {
    char value[4];
    EXPECT_EQ(-1, MAVOEAXattrGet(nullptr, "user.a", value, 4));
    ExpectCheckFailed("ea_xattr_get", "((void *)0) != szPath");
}

// Promise: "MAVOEAXattrGet: -1: 0xD00"
TEST_F(XattrGetTest, ANullNameIsLoggedAndRecorded) {
    char value[4];
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), nullptr, value, 4));
    ExpectCheckFailed("ea_xattr_get", "((void *)0) != szName");
}

// Promise: "Named attributes: NULL and negative"
TEST_F(XattrGetTest, ABufferThatDoesNotFitItsSizeIsLoggedAndRecorded) {
    char value[4];
    const std::string check = "((0 < cbValue && NULL != szValue) || 0 == cbValue)";
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.a", nullptr, 4));
    ExpectCheckFailed("ea_xattr_get", check);
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.a", nullptr, -1));
    ExpectCheckFailed("ea_xattr_get", check);
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.a", value, -1));
    ExpectCheckFailed("ea_xattr_get", check);
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "com.apple.ResourceFork", value, INT_MIN));
    ExpectCheckFailed("ea_xattr_get", check);
}

TEST_F(XattrGetTest, ArgumentsAreCheckedFromLeftToRight) {
    EXPECT_EQ(-1, MAVOEAXattrGet(nullptr, nullptr, nullptr, -1));
    ExpectCheckFailed("ea_xattr_get", "((void *)0) != szPath");
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), nullptr, nullptr, -1));
    ExpectCheckFailed("ea_xattr_get", "((void *)0) != szName");
}

// Promise: "MAVOEAXattrGet: Reads"
TEST_F(RealXattrGetTest, AValueIsReadIntoTheBuffer) {
    using namespace std::string_literals;
    const std::string stored = "a\0b\xFF"s;
    Put("user.binary", stored);
    char value[8];
    memset(value, '#', sizeof value);
    EXPECT_EQ(4, MAVOEAXattrGet(object_.c_str(), "user.binary", value, 8));
    EXPECT_EQ(stored + "####", std::string(value, 8));
    ExpectNothingReported();
}

TEST_F(RealXattrGetTest, ABufferOfExactlyTheValuesSizeIsEnough) {
    Put("user.a", "abcd");
    char value[4];
    EXPECT_EQ(4, MAVOEAXattrGet(object_.c_str(), "user.a", value, 4));
    EXPECT_EQ("abcd", std::string(value, 4));
}

TEST_F(RealXattrGetTest, ABufferThatIsTooSmallFailsWithErangeAndRecordsNothing) {
    Put("user.a", "abcd");
    char value[3];
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.a", value, 3));
    EXPECT_EQ(ERANGE, errno);
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrGet: with cbValue 0"
TEST_F(RealXattrGetTest, WithoutABufferTheLengthIsReturned) {
    Put("user.a", "abcde");
    EXPECT_EQ(5, MAVOEAXattrGet(object_.c_str(), "user.a", nullptr, 0));
    char untouched = '#';
    EXPECT_EQ(5, MAVOEAXattrGet(object_.c_str(), "user.a", &untouched, 0));
    EXPECT_EQ('#', untouched);
    ExpectNothingReported();
}

TEST_F(RealXattrGetTest, AnEmptyValueHasLengthZero) {
    Put("user.empty", "");
    char value[4];
    EXPECT_EQ(0, MAVOEAXattrGet(object_.c_str(), "user.empty", value, 4));
    EXPECT_EQ(0, MAVOEAXattrGet(object_.c_str(), "user.empty", nullptr, 0));
    ExpectNothingReported();
}

TEST_F(RealXattrGetTest, AMissingAttributeFailsWithEnodataAndRecordsNothing) {
    char value[4];
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.none", value, 4));
    EXPECT_EQ(ENODATA, errno);
    ExpectNothingReported();
}

TEST_F(XattrGetTest, AMissingFileFailsWithEnoentAndRecordsNothing) {
    char value[4];
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrGet(missing_.c_str(), "user.a", value, 4));
    EXPECT_EQ(ENOENT, errno);
    ExpectNothingReported();
}

// Promise: "Named attributes: Failures of the attribute calls"
TEST_F(XattrGetTest, AnyFailureKeepsItsErrnoAndRecordsNothing) {
    const FailCall fault("getxattr", EIO);
    char value[4];
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.a", value, 4));
    EXPECT_EQ(EIO, errno);
    ExpectNothingReported();
}

TEST_F(XattrGetTest, AnyNegativeResultBecomesMinusOne) {
    Hooks().getxattr = [](const char*, const char*, void*, size_t) -> ssize_t { return -61; };
    char value[4];
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.a", value, 4));
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "user.a", nullptr, 0));
    ExpectNothingReported();
}

TEST_F(RealXattrGetTest, AValueThatSetfattrWroteIsRead) {
    if (!HasProgram("setfattr")) GTEST_SKIP() << "setfattr is not installed (package attr)";
    ASSERT_EQ(0, RunProgram("setfattr -n user.hex -v 0x00FF4D " + Quoted(object_)).status);
    char value[8];
    ASSERT_EQ(3, MAVOEAXattrGet(object_.c_str(), "user.hex", value, 8));
    EXPECT_EQ(Hex("00 FF 4D"), Bytes(value, value + 3));
}

// Promise: "Named attributes: symbolic links"
TEST_F(RealXattrGetTest, SymbolicLinksAreFollowed) {
    Put("user.a", "of target");
    const std::string link = dir_ / "link";
    ASSERT_EQ(0, symlink(object_.c_str(), link.c_str()));
    char value[16];
    ASSERT_EQ(9, MAVOEAXattrGet(link.c_str(), "user.a", value, 16));
    EXPECT_EQ("of target", std::string(value, 9));
}

// ---- Set ------------------------------------------------------------------------------------

using XattrSetTest = XattrTest;
using RealXattrSetTest = RealXattrTest;

// Promise: "MAVOEAXattrSet: -1: 0xD00"
TEST_F(XattrSetTest, ANullPathIsLoggedAndRecorded) {
    EXPECT_EQ(-1, MAVOEAXattrSet(nullptr, "user.a", "v", 1, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szPath");
}

// Promise: "MAVOEAXattrSet: -1: 0xD00"
TEST_F(XattrSetTest, ANullNameIsLoggedAndRecorded) {
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), nullptr, "v", 1, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szName");
}

// Promise: "MAVOEAXattrSet: szValue"
TEST_F(XattrSetTest, ANullValueIsLoggedAndRecordedEvenForNoBytes) {
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "user.a", nullptr, 1, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szValue");
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "user.a", nullptr, 0, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szValue");
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "com.apple.ResourceFork", nullptr, 0, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szValue");
}

// Promise: "Named attributes: NULL and negative"
TEST_F(XattrSetTest, ANegativeSizeIsLoggedAndRecorded) {
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "user.a", "v", -1, 0));
    ExpectCheckFailed("ea_xattr_set", "0 <= cbValue");
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "com.apple.ResourceFork", "v", INT_MIN, 0));
    ExpectCheckFailed("ea_xattr_set", "0 <= cbValue");
}

TEST_F(XattrSetTest, ArgumentsAreCheckedFromLeftToRight) {
    EXPECT_EQ(-1, MAVOEAXattrSet(nullptr, nullptr, nullptr, -1, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szPath");
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), nullptr, nullptr, -1, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szName");
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "user.a", nullptr, -1, 0));
    ExpectCheckFailed("ea_xattr_set", "((void *)0) != szValue");
}

TEST_F(RealXattrSetTest, AValueIsStoredWithItsZeroBytes) {
    using namespace std::string_literals;
    EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.binary", "a\0b\xFF", 4, 0));
    EXPECT_EQ("a\0b\xFF"s, ValueOf("user.binary"));
    ExpectNothingReported();
}

// Promise: "Named attributes: The object's own"
// Promise: "MAVOEAXattrSet: Sets"
TEST_F(RealXattrSetTest, GetfattrSeesTheValue) {
    if (!HasProgram("getfattr")) GTEST_SKIP() << "getfattr is not installed (package attr)";
    ASSERT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.seen", "by others", 9, 0));
    const auto seen =
        RunProgram("getfattr --absolute-names --only-values -n user.seen " + Quoted(object_));
    EXPECT_EQ(0, seen.status);
    EXPECT_EQ("by others", seen.output);
}

TEST_F(RealXattrSetTest, AValueOfNoBytesIsStored) {
    EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.empty", "ignored", 0, 0));
    EXPECT_EQ("", ValueOf("user.empty"));
}

TEST_F(RealXattrSetTest, WithoutFlagsAValueIsCreatedAndReplaced) {
    EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.a", "long value", 10, 0));
    EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.a", "short", 5, 0));
    EXPECT_EQ("short", ValueOf("user.a"));
}

// Promise: "MAVOEAXattrSet: flags as"
TEST_F(RealXattrSetTest, Flag1OnlyCreates) {
    EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.a", "one", 3, 1));
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "user.a", "two", 3, 1));
    EXPECT_EQ(EEXIST, errno);
    EXPECT_EQ("one", ValueOf("user.a"));
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrSet: flags as"
TEST_F(RealXattrSetTest, Flag2OnlyReplaces) {
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "user.a", "one", 3, 2));
    EXPECT_EQ(ENODATA, errno);
    Put("user.a", "old");
    EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.a", "new", 3, 2));
    EXPECT_EQ("new", ValueOf("user.a"));
    ExpectNothingReported();
}

// Promise: "Named attributes: symbolic links"
TEST_F(RealXattrSetTest, SymbolicLinksAreFollowed) {
    const std::string link = dir_ / "link";
    ASSERT_EQ(0, symlink(object_.c_str(), link.c_str()));
    EXPECT_EQ(0, MAVOEAXattrSet(link.c_str(), "user.a", "x", 1, 0));
    EXPECT_EQ("x", ValueOf("user.a"));
}

// Promise: "Named attributes: Failures of the attribute calls"
TEST_F(XattrSetTest, AFailureKeepsItsErrnoAndRecordsNothing) {
    for (const int error : {ENOSPC, EPERM, ENOTSUP}) {
        const FailCall fault("setxattr", error);
        EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "user.a", "x", 1, 0));
        EXPECT_EQ(error, errno);
        ExpectNothingReported();
    }
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrSet(missing_.c_str(), "user.a", "x", 1, 0));
    EXPECT_EQ(ENOENT, errno);
    ExpectNothingReported();
}

TEST_F(XattrSetTest, TheKernelsResultIsReturnedAsItStands) {
    for (const int answer : {0, -1, -5, 7}) {
        Hooks().setxattr = [answer](const char*, const char*, const void*, size_t, int) {
            return answer;
        };
        EXPECT_EQ(answer, MAVOEAXattrSet(object_.c_str(), "user.a", "x", 1, 0));
    }
    ExpectNothingReported();
}

// Promise: "MAVOEAXattrSet: flags as"
TEST_F(XattrSetTest, FlagsAreHandedThroughUnchanged) {
    Hooks().setxattr = [](const char*, const char*, const void*, size_t, int) { return 0; };
    for (const int flags : {0, 1, 2, 3, 0x40, -1}) {
        TakeCalls();
        EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), "user.a", "xyz", 3, flags));
        EXPECT_THAT(TakeCalls(), ElementsAre("setxattr(" + object_ + ", user.a, 3, " +
                                             std::to_string(flags) + ")"));
    }
}

// ---- Remove ---------------------------------------------------------------------------------

using XattrRemoveTest = XattrTest;
using RealXattrRemoveTest = RealXattrTest;

// Promise: "MAVOEAXattrRemove: -1: 0xD00"
TEST_F(XattrRemoveTest, ANullPathIsLoggedAndRecorded) {
    EXPECT_EQ(-1, MAVOEAXattrRemove(nullptr, "user.a"));
    ExpectCheckFailed("ea_xattr_remove", "((void *)0) != szPath");
    EXPECT_EQ(-1, MAVOEAXattrRemove(nullptr, nullptr));
    ExpectCheckFailed("ea_xattr_remove", "((void *)0) != szPath");
}

// Promise: "MAVOEAXattrRemove: -1: 0xD00"
TEST_F(XattrRemoveTest, ANullNameIsLoggedAndRecorded) {
    EXPECT_EQ(-1, MAVOEAXattrRemove(object_.c_str(), nullptr));
    ExpectCheckFailed("ea_xattr_remove", "NULL != szName");
}

// Promise: "MAVOEAXattrRemove: Removes"
TEST_F(RealXattrRemoveTest, OnlyTheNamedAttributeGoes) {
    Put("user.a", "1");
    Put("user.b", "2");
    EXPECT_EQ(0, MAVOEAXattrRemove(object_.c_str(), "user.a"));
    EXPECT_EQ(std::string("(") + strerror(ENODATA) + ")", ValueOf("user.a"));
    EXPECT_EQ("2", ValueOf("user.b"));
    ExpectNothingReported();
}

TEST_F(RealXattrRemoveTest, GetfattrNoLongerSeesIt) {
    if (!HasProgram("getfattr")) GTEST_SKIP() << "getfattr is not installed (package attr)";
    Put("user.gone", "1");
    Put("user.stays", "2");
    ASSERT_EQ(0, MAVOEAXattrRemove(object_.c_str(), "user.gone"));
    const auto seen = RunProgram("getfattr --absolute-names -m user. " + Quoted(object_));
    EXPECT_EQ("# file: " + object_ + "\nuser.stays\n\n", seen.output);
}

// Promise: "Named attributes: symbolic links"
TEST_F(RealXattrRemoveTest, SymbolicLinksAreFollowed) {
    Put("user.a", "1");
    const std::string link = dir_ / "link";
    ASSERT_EQ(0, symlink(object_.c_str(), link.c_str()));
    EXPECT_EQ(0, MAVOEAXattrRemove(link.c_str(), "user.a"));
    EXPECT_EQ(std::string("(") + strerror(ENODATA) + ")", ValueOf("user.a"));
}

TEST_F(RealXattrRemoveTest, AMissingAttributeFailsWithEnodataAndRecordsNothing) {
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrRemove(object_.c_str(), "user.none"));
    EXPECT_EQ(ENODATA, errno);
    ExpectNothingReported();
}

// Promise: "Named attributes: Failures of the attribute calls"
TEST_F(XattrRemoveTest, AFailureKeepsItsErrnoAndRecordsNothing) {
    {
        const FailCall fault("removexattr", EPERM);
        EXPECT_EQ(-1, MAVOEAXattrRemove(object_.c_str(), "user.a"));
        EXPECT_EQ(EPERM, errno);
    }
    errno = 0;
    EXPECT_EQ(-1, MAVOEAXattrRemove(missing_.c_str(), "user.a"));
    EXPECT_EQ(ENOENT, errno);
    ExpectNothingReported();
}

TEST_F(XattrRemoveTest, TheKernelsResultIsReturnedAsItStands) {
    for (const int answer : {0, -1, -5, 7}) {
        Hooks().removexattr = [answer](const char*, const char*) { return answer; };
        EXPECT_EQ(answer, MAVOEAXattrRemove(object_.c_str(), "user.a"));
    }
    ExpectNothingReported();
}

// ---- Names ----------------------------------------------------------------------------------

// A volume that keeps attributes of any name.
class XattrNameTest : public XattrTest {
 protected:
    void SetUp() override {
        XattrTest::SetUp();
        Hooks().getxattr = [this](const char*, const char* name, void* value,
                                  size_t size) -> ssize_t {
            const auto found = attributes_.find(name);
            if (found == attributes_.end()) {
                errno = ENODATA;
                return -1;
            }
            if (size >= found->second.size()) {
                memcpy(value, found->second.data(), found->second.size());
            }
            return static_cast<ssize_t>(found->second.size());
        };
        Hooks().setxattr = [this](const char*, const char* name, const void* value, size_t size,
                                  int) {
            attributes_[name] = std::string(static_cast<const char*>(value), size);
            return 0;
        };
        Hooks().removexattr = [this](const char*, const char* name) {
            return attributes_.erase(name) == 1 ? 0 : -1;
        };
    }

    std::map<std::string, std::string> attributes_;
};

// Promise: "Named attributes: The object's own"
TEST_F(XattrNameTest, NamesOtherThanTheResourceForkArePassedThroughUnchanged) {
    for (const std::string name :
         {"com.apple.FinderInfo", "com.apple.resourcefork", "COM.APPLE.RESOURCEFORK",
          "com.apple.ResourceForks", "com.apple.ResourceFor", "user.com.apple.ResourceFork",
          "ResourceFork", "user.netatalk.Metadata", "plain", "\xC3\xA4 b/c:d", ""}) {
        SCOPED_TRACE(name);
        attributes_.clear();
        TakeCalls();
        EXPECT_EQ(0, MAVOEAXattrSet(object_.c_str(), name.c_str(), "value", 5, 0));
        EXPECT_EQ((std::map<std::string, std::string>{{name, "value"}}), attributes_);
        char value[8];
        EXPECT_EQ(5, MAVOEAXattrGet(object_.c_str(), name.c_str(), value, 8));
        EXPECT_EQ("value", std::string(value, 5));
        EXPECT_EQ(0, MAVOEAXattrRemove(object_.c_str(), name.c_str()));
        EXPECT_THAT(attributes_, IsEmpty());
        EXPECT_THAT(TakeCalls(), ElementsAre("setxattr(" + object_ + ", " + name + ", 5, 0)",
                                             "getxattr(" + object_ + ", " + name + ", 8)",
                                             "removexattr(" + object_ + ", " + name + ")"));
    }
    ExpectNothingReported();
}

TEST_F(XattrNameTest, TheResourceForkNeverReachesTheAttributeCalls) {
    attributes_["com.apple.ResourceFork"] = "not this";
    char value[16];
    EXPECT_EQ(-1, MAVOEAXattrGet(object_.c_str(), "com.apple.ResourceFork", value, 16));
    EXPECT_EQ(-1, MAVOEAXattrSet(object_.c_str(), "com.apple.ResourceFork", "x", 1, 0));
    EXPECT_EQ(-1, MAVOEAXattrRemove(object_.c_str(), "com.apple.ResourceFork"));
    EXPECT_EQ("not this", attributes_["com.apple.ResourceFork"]);
    EXPECT_THAT(TakeCallNames(), AllOf(Not(Contains("getxattr")), Not(Contains("setxattr")),
                                       Not(Contains("removexattr"))));
}

}  // namespace
}  // namespace mavoea::test

// The copy of an object's metadata between volumes of any two types: which copy runs for a pair of
// types, what stands at both ends afterwards, what the platform is asked to do, and what is said
// when a step fails.

#include <errno.h>
#include <gmock/gmock.h>
#include <string.h>
#include <sys/stat.h>

#include <optional>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/copy_world.h"
#include "tests/support/emulator.h"

namespace mavoea::test {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

constexpr char kUnit[] = "ea_copy.c";

std::string Top() {
    char text[200];
    snprintf(text, sizeof text, "[0x%04X %s:%d]", static_cast<unsigned>(MLIBCErrGet()),
             MLIBCErrorGetFile(), MLIBCErrorGetLine());
    return text;
}
// A line that tells the top of the error stack, as it stands now.
std::string Wrapped(const std::string& text) { return "ea_copy.c:LINE " + Top() + text; }
std::string CopyFail(int error) {
    return Wrapped(std::string("EACopy fail: from [src/object] to [dst/object] ") +
                   strerror(error));
}
std::string Failed(const std::string& what, int error) {
    return Wrapped("Failed " + what + " [src/object]->[dst/object]. " + strerror(error));
}

// ---- Every pair of types ------------------------------------------------------------------------

enum class Kind { kAppleDouble, kEADir, kFileEA, kAttribute, kOnlyDestination, kNone };
using enum Kind;

Kind KindOf(int type) {
    constexpr Kind kKinds[] = {kAppleDouble, kEADir, kFileEA,          kEADir, kNone,
                               kAppleDouble, kEADir, kAttribute,       kNone,  kNone,
                               kEADir,       kNone,  kOnlyDestination, kNone};
    return kKinds[type];
}

struct Outcome {
    int result = 0;
    Side src;
    Side dst;
    std::vector<std::string> platform;
    std::vector<std::string> copied;
    std::vector<std::string> log;
    std::vector<std::string> commands;
    std::vector<std::string> archived;
    int unlink_records = 0;  // of code 0x2A00
};

// What has to come of one copy, worked out without the library.
class Expectation {
 public:
    Expectation(const CopyWorld& world, const CopyWorld::Call& call)
        : call_(call), order_(world.FolderOrder()) {
        outcome_.src = world.SideAt("src");
        outcome_.dst = world.SideAt("dst");
    }

    Outcome WorkOut() {
        outcome_.result = Run();
        Notify();
        return outcome_;
    }

 private:
    bool moves() const { return call_.move != 0; }
    void Platform(const std::string& call) { outcome_.platform.push_back(call); }

    int Run() {
        if (call_.src_type == -1) {
            Platform("MAVOGetFSType(src/object, 1)");
            outcome_.log.push_back(
                "ea_copy.c:LINE(MAVOEACopyEx) Failed to get fs type of src/object.");
            return -1;
        }
        if (call_.dst_type == -1) {
            Platform("MAVOGetFSType(dst, 1)");
            outcome_.log.push_back(
                "ea_copy.c:LINE(MAVOEACopyEx) Failed to get fs type of dst/object.");
            return -1;
        }
        src_ = KindOf(call_.src_type);
        dst_ = KindOf(call_.dst_type);
        if (src_ == kNone || src_ == kOnlyDestination) return -4;
        const bool nowhere = dst_ == kNone || (dst_ == kOnlyDestination &&
                                               (src_ == kAppleDouble || src_ == kAttribute));
        if (nowhere) return 0;
        switch (src_) {
            case kAppleDouble:
                FromAppleDouble();
                break;
            case kAttribute:
                FromAttributes();
                break;
            default:
                FromEADir();
                break;
        }
        CarryLock();
        Finish();
        return 0;
    }

    void CopyWhole(const char* name, bool by_command) {
        outcome_.dst[name] = outcome_.src[name];
        if (by_command) {
            Platform(std::string("MLIBCExec(/bin/cp, -f, src/") + name + ", dst/" + name + ")");
        } else {
            outcome_.copied.push_back(std::string("src/") + name + " dst/" + name);
        }
    }
    void MakeEADirectory(const std::string& name = "@eaDir") {
        if (!outcome_.dst.emplace(name + "/", "").second) return;
        Platform("MAVOGetFSType(dst/" + name + ", 0)");
        Platform("MAVOACLSetEADirACL(dst/" + name + ")");
    }
    void SetAttribute(const std::string& name, const std::string& value) {
        outcome_.dst["attribute " + name] = value;
    }
    void RemoveAtSource(const std::string& name) {
        std::erase_if(outcome_.src,
                      [&](const auto& entry) { return entry.first.starts_with(name); });
    }
    void StampFileEA(const Bytes& finder_info) {
        SetAttribute(kRecordAttribute, Text(finder_info));
        SetAttribute(kFlushTimeAttribute, "ABCD");
    }

    static std::string Stream(std::vector<Attribute> attributes) {
        StreamImage image;
        image.attributes = std::move(attributes);
        return Text(image.Build());
    }
    // Header, two descriptors, Finder info at 50, fork at 82.
    static std::string TwoEntries(const Bytes& filler, const Bytes& finder_info,
                                  const std::string& fork) {
        Bytes file = Hex("00 05 16 07 00 02 00 00") + filler +
                     Hex("00 02  00 00 00 09 00 00 00 32 00 00 00 20"
                         "       00 00 00 02 00 00 00 52 00 00 00 00") +
                     finder_info + Ascii(fork);
        PutU32(file, 46, fork.size());
        return Text(file);
    }

    void FromAppleDouble() {
        const Bytes finder_info = Pattern(32, 0x10);
        const std::string fork = "fork of the AppleDouble file";
        switch (dst_) {
            case kAppleDouble:
                CopyWhole(kAppleDoubleFile, true);
                break;
            case kAttribute:
                SetAttribute("user.ad", "from the AppleDouble file");
                SetAttribute(kForkAttribute, fork);
                SetAttribute(kFinderInfoAttribute, Text(finder_info));
                break;
            default:
                MakeEADirectory();
                outcome_.dst[kResourceFile] =
                    TwoEntries(Ascii("Mac OS X        "), finder_info, fork);
                outcome_.dst[kStreamFile] =
                    Stream({{"user.ad", Ascii("from the AppleDouble file")}});
                if (dst_ == kFileEA) StampFileEA(finder_info);
                break;
        }
        if (moves()) outcome_.src.erase(kAppleDoubleFile);
    }

    void FromAttributes() {
        const Bytes finder_info = Pattern(32, 0x70);
        const std::string fork = "fork of the attributes";
        const Bytes filler = Ascii("MAVONICS        ");
        const std::vector<Attribute> attributes = {{"user.x", Ascii("from the attributes")},
                                                   {kRecordAttribute, AttributeRecord()}};
        switch (dst_) {
            case kAppleDouble: {
                StreamImage image;
                image.attributes = attributes;
                image.finder_info = finder_info;
                image.fork = Ascii(fork);
                image.filler = filler;
                outcome_.dst[kAppleDoubleFile] = Text(image.Build());
                break;
            }
            case kAttribute:
                for (const auto& [name, value] : outcome_.src) {
                    if (name.starts_with("attribute ")) outcome_.dst[name] = value;
                }
                break;
            default:
                MakeEADirectory();
                outcome_.dst[kResourceFile] = TwoEntries(filler, finder_info, fork);
                outcome_.dst[kStreamFile] = Stream(attributes);
                if (dst_ == kFileEA) StampFileEA(finder_info);
                break;
        }
        if (call_.move == 1) outcome_.src.erase(kResourceFile);
    }

    void FromEADir() {
        Bytes finder_info = Pattern(32, 0x20);
        const std::string fork = "fork of the resource file";
        if (src_ == kFileEA && dst_ != kFileEA) {
            // The attribute's Finder info, into the resource file of thirteen entries.
            finder_info = Pattern(32, 0x40);
            outcome_.src[kResourceFile] = Text(PlainAppleDouble(finder_info, Ascii(fork), 13));
        }
        const std::vector<Attribute> attributes = {{"user.ea", Ascii("from the stream")}};
        const bool both_file_ea = src_ == kFileEA && dst_ == kFileEA;
        switch (dst_) {
            case kAppleDouble: {
                Platform("MAVOStrReplaceFATReservedChar(dst/._object)");
                StreamImage image;
                image.attributes = attributes;
                image.finder_info = finder_info;
                image.fork = Ascii(fork);
                image.filler = Repeat(0, 16);
                outcome_.dst[kAppleDoubleFile] = Text(image.Build());
                break;
            }
            case kAttribute:
                SetAttribute("user.ea", "from the stream");
                SetAttribute(kForkAttribute, fork);
                SetAttribute(kFinderInfoAttribute, Text(finder_info));
                break;
            default:
                MakeEADirectory();
                if (dst_ == kFileEA && !both_file_ea) {
                    outcome_.dst[kResourceFile] = TwoEntries(Repeat(0, 16), finder_info, fork);
                } else {
                    CopyWhole(kResourceFile, both_file_ea || !call_.with_copier);
                }
                CopyWhole(kStreamFile, both_file_ea || !call_.with_copier);
                if (dst_ == kFileEA) StampFileEA(finder_info);
                break;
        }
        if (!moves()) return;
        outcome_.src.erase(kResourceFile);
        outcome_.src.erase(kStreamFile);
        if (src_ == kFileEA && !both_file_ea) {
            outcome_.src.erase(std::string("attribute ") + kRecordAttribute);
        }
    }

    // The record of the source's attribute says that it is locked. Nothing else does.
    void CarryLock() {
        const bool ea_dir = src_ == kEADir || src_ == kFileEA;
        if (ea_dir) Platform("MLIBCFileStat(src/object, 3)");
        const bool locked =
            src_ == kFileEA && outcome_.src.contains(std::string("attribute ") + kRecordAttribute);
        if (dst_ == kAppleDouble || dst_ == kAttribute) {
            outcome_.dst["mode"] = locked ? "0444" : "0666";
        } else {
            outcome_.commands.push_back(locked ? "dst/object 522" : "dst/object 521");
        }
    }

    void Finish() {
        const bool beside = src_ == kAppleDouble || dst_ == kAppleDouble;
        const bool ea_dir_to_beside = src_ == kEADir && dst_ == kAppleDouble;
        bool clean = ea_dir_to_beside;
        if (moves() && ea_dir_to_beside && (call_.src_type == 1 || call_.src_type == 10)) {
            // With its stream gone, the "._" file is taken for one and goes as well.
            outcome_.src.erase(kAppleDoubleFile);
            if (call_.copy_eadir == 0) {
                Platform("MLIBCExec(/bin/rm, -rf, src/@eaDir/object)");
                RemoveAtSource(kFolder);
            }
        }
        // Every path that could be told is gone by now.
        if (moves() && beside) ++outcome_.unlink_records;
        if (call_.copy_eadir != 0 || !beside) {
            clean = true;
            CarryFolder();
        }
        if (moves() && clean && !HoldsMore()) outcome_.src.erase(kEADirectory);
        outcome_.archived.push_back("dst/object");
    }
    bool HoldsMore() const {
        const auto next = outcome_.src.upper_bound(kEADirectory);
        return next != outcome_.src.end() && next->first.starts_with(kEADirectory);
    }

    void CarryFolder() {
        MakeEADirectory();
        MakeEADirectory("@eaDir/object");
        const auto remove = [&](const std::string& path) {
            Platform("MLIBCExec(/bin/rm, -rf, " + path + ")");
        };
        for (const std::string& name : order_) {
            const std::string from = "src/" + std::string(kFolder) + name;
            const std::string to = "dst/" + std::string(kFolder) + name;
            if (name == "MAVOThumb") {
                if (call_.with_copier) {
                    outcome_.copied.push_back(from + " " + to);
                } else {
                    if (moves()) Platform("MLIBCExec(/bin/mv, -f, " + from + ", " + to + ")");
                    Platform("MLIBCExec(/bin/cp, -f, " + from + ", " + to + ")");
                }
                outcome_.dst[kThumb] = "thumb";
            }
            if (moves() && (name != "MAVOThumb" || call_.with_copier)) remove(from);
        }
        if (!moves()) return;
        remove("src/@eaDir/object");
        RemoveAtSource(kFolder);
    }

    void Notify() {
        if (moves()) {
            Platform("MLIBMavoIndexAddEx(dst/object, src/object, 4, 0, 0)");
            Platform("MLIBMavoFileIndexAdd(src/object, NULL, 6)");
            Platform("MLIBMavoFileIndexAdd(dst/object, NULL, 3)");
        } else {
            Platform("MLIBMavoIndexAddEx(dst/object, NULL, 1, 0, 0)");
            Platform("MLIBMavoFileIndexAdd(dst/object, NULL, 1)");
        }
    }

    CopyWorld::Call call_;
    std::vector<std::string> order_;
    Outcome outcome_;
    Kind src_ = kNone;
    Kind dst_ = kNone;
};

void ExpectOutcome(const Outcome& expected, const CopyWorld& world, int result) {
    EXPECT_EQ(expected.result, result);
    EXPECT_EQ(expected.platform, world.TakePlatform());
    EXPECT_EQ(expected.copied, world.copied);
    EXPECT_EQ(expected.log, world.TakeLines());
    EXPECT_EQ(expected.commands, world.commands);
    EXPECT_EQ(expected.archived, world.archived);
    EXPECT_EQ(expected.src, world.SideAt("src"));
    EXPECT_EQ(expected.dst, world.SideAt("dst"));
    const auto records = TakeRecords();
    EXPECT_EQ(expected.unlink_records, static_cast<int>(records.size()))
        << ::testing::PrintToString(records);
    for (const Record& record : records) EXPECT_THAT(record, RecordOf(0x2A00, kUnit));
}

class CopyTableTest : public ::testing::TestWithParam<int> {};

// Promise: "MAVOEACopyEx: Carries"
// Promise: "MAVOEACopyEx: What was moved"
TEST_P(CopyTableTest, EachDestinationTypeGetsWhatItTakesInEveryKindOfCopy) {
    for (int dst = -1; dst <= 13; ++dst) {
        for (int move = 0; move <= 2; ++move) {
            for (const int copy_eadir : {0, 1}) {
                for (const bool with_copier : {false, true}) {
                    CopyWorld world;
                    world.src_type = world.dst_type = -1;
                    const CopyWorld::Call call = {.move = move,
                                                  .copy_eadir = copy_eadir,
                                                  .src_type = GetParam(),
                                                  .dst_type = dst,
                                                  .file_index = 1,
                                                  .index = 1,
                                                  .with_copier = with_copier};
                    SCOPED_TRACE(::testing::Message()
                                 << GetParam() << " to " << dst << ", move " << move
                                 << ", copyEADir " << copy_eadir << ", copyFn " << with_copier);
                    const Outcome expected = Expectation(world, call).WorkOut();
                    ExpectOutcome(expected, world, world.Copy(call));
                    if (HasFailure()) return;  // One is enough to look at.
                }
            }
        }
    }
}

TEST_P(CopyTableTest, TypesThatAreAskedMeanTheSame) {
    if (GetParam() < 0) return;
    for (int dst = 0; dst <= 13; ++dst) {
        SCOPED_TRACE(dst);
        CopyWorld world;
        world.src_type = GetParam();
        world.dst_type = dst;
        CopyWorld::Call call = {
            .src_type = GetParam(), .dst_type = dst, .file_index = 1, .index = 1};
        Outcome expected = Expectation(world, call).WorkOut();
        expected.platform.insert(expected.platform.begin(),
                                 {"MAVOGetFSType(src/object, 1)", "MAVOGetFSType(dst, 1)"});
        call.src_type = call.dst_type = -1;
        ExpectOutcome(expected, world, world.Copy(call));
    }
}

INSTANTIATE_TEST_SUITE_P(FromEveryType, CopyTableTest, ::testing::Range(-1, 14),
                         [](const ::testing::TestParamInfo<int>& tested) {
                             return tested.param < 0 ? std::string("Unknown")
                                                     : "Type" + std::to_string(tested.param);
                         });

// ---- Asking for types ---------------------------------------------------------------------------

class CopyDriverTest : public ::testing::Test {
 protected:
    // Nothing behind the copy itself has been done.
    void ExpectNotFinished() {
        EXPECT_THAT(world_.archived, IsEmpty());
        EXPECT_TRUE(world_.Has("src/@eaDir/object/MAVOThumb"));
        EXPECT_FALSE(world_.Has("dst/@eaDir/object"));
    }
    void ExpectFinished() { EXPECT_THAT(world_.archived, ElementsAre("dst/object")); }

    CopyWorld world_;
};

// Promise: "MAVOEACopyEx: A failure may record"
TEST_F(CopyDriverTest, ASourceTypeThatCannotBeToldEndsItBeforeTheDestinationIsAsked) {
    world_.src_type = -1;
    EXPECT_EQ(-1, world_.Copy({}));
    EXPECT_THAT(world_.TakePlatform(), ElementsAre("MAVOGetFSType(src/object, 1)"));
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre("ea_copy.c:LINE(MAVOEACopyEx) Failed to get fs type of src/object."));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    ExpectNotFinished();
}

TEST_F(CopyDriverTest, ADestinationTypeThatCannotBeToldEndsItWithItsPathWhole) {
    for (const int answer : {-1, -7}) {
        world_.dst_type = answer;
        EXPECT_EQ(-1, world_.Copy({.src_type = 1}));
        EXPECT_THAT(world_.TakePlatform(), ElementsAre("MAVOGetFSType(dst, 1)"));
        EXPECT_THAT(
            world_.TakeLines(),
            ElementsAre("ea_copy.c:LINE(MAVOEACopyEx) Failed to get fs type of dst/object."));
    }
    EXPECT_EQ(-1, world_.Copy({.src_type = 1, .dst_type = -2}));
    EXPECT_THAT(world_.TakePlatform(), IsEmpty());
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre("ea_copy.c:LINE(MAVOEACopyEx) Failed to get fs type of dst/object."));
    EXPECT_THAT(TakeRecords(), IsEmpty());
    ExpectNotFinished();
}

// Promise: "MAVOEACopyEx: szDst is written to"
TEST_F(CopyDriverTest, TheDestinationsParentIsAskedForTheType) {
    std::string asked;
    Platform().fs_type = [&](const std::string& path, int) {
        asked = path;
        return 4;
    };
    for (const auto& [dst, parent] : {std::pair{"/object", ""}, {"/a/b/", "/a/b"}, {"a/b", "a"}}) {
        std::string path = dst;
        EXPECT_EQ(0, CopyWorld::CopyPaths(world_.src().c_str(), path.data(), {.src_type = 1}));
        EXPECT_EQ(parent, asked);
        EXPECT_EQ(dst, path);
    }
}

TEST_F(CopyDriverTest, ADestinationWithoutASlashHasNoParentToAsk) {
    std::string path = "object";
    errno = EMLINK;
    EXPECT_EQ(-1, CopyWorld::CopyPaths(world_.src().c_str(), path.data(),
                                       {.src_type = 1, .file_index = 1, .index = 1}));
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre(std::string("ea_copy.c:LINE(MAVOEACopyEx) Failed to strrchr '/' of "
                                        "object, reason=") +
                            strerror(EMLINK) + "."));
    EXPECT_THAT(world_.TakePlatform(), ElementsAre("MLIBMavoIndexAddEx(object, NULL, 1, 0, 0)",
                                                   "MLIBMavoFileIndexAdd(object, NULL, 1)"));
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(CopyDriverTest, ADestinationTypeThatIsGivenNeedsNoSlash) {
    std::string path = "object";
    EXPECT_EQ(0, CopyWorld::CopyPaths(world_.src().c_str(), path.data(),
                                      {.src_type = 7, .dst_type = 12}));
    ExpectNothingReported();
}

TEST_F(CopyDriverTest, AnUnknownSourceStillHasTheDestinationAsked) {
    world_.dst_type = -1;
    EXPECT_EQ(-1, world_.Copy({.src_type = 4}));
    world_.dst_type = 1;
    EXPECT_EQ(-4, world_.Copy({.src_type = 4}));
}

// Promise: "MAVOEACopyEx: 0xD00 is NULL"
// Promise: "MAVOEACopyEx: A failure may record"
TEST_F(CopyDriverTest, NullPathsAreRefused) {
    std::string dst = world_.dst();
    for (const int type : {-1, 0, 1, 2, 4, 7}) {
        for (const int move : {0, 1}) {
            const CopyWorld::Call call = {
                .move = move, .copy_eadir = 1, .src_type = type, .dst_type = type};
            EXPECT_EQ(-1, CopyWorld::CopyPaths(nullptr, dst.data(), call));
            EXPECT_EQ(-1, CopyWorld::CopyPaths(world_.src().c_str(), nullptr, call));
            EXPECT_EQ(-1, CopyWorld::CopyPaths(nullptr, nullptr, call));
            EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, kUnit), RecordOf(0xD00, kUnit),
                                                   RecordOf(0xD00, kUnit)));
            EXPECT_EQ(-1, MAVOEACopy(nullptr, nullptr, move, 0, type, type, 0, 0));
            EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, kUnit)));
        }
    }
    EXPECT_THAT(world_.TakePlatform(), IsEmpty());
}

TEST_F(CopyDriverTest, ACopyToNowhereIsReportedToTheIndexesAsItIs) {
    EXPECT_EQ(-1,
              CopyWorld::CopyPaths(world_.src().c_str(), nullptr, {.file_index = 1, .index = 1}));
    EXPECT_THAT(world_.TakePlatform(), ElementsAre("MLIBMavoIndexAddEx(NULL, NULL, 1, 0, 0)",
                                                   "MLIBMavoFileIndexAdd(NULL, NULL, 1)"));
    EXPECT_EQ(-1, CopyWorld::CopyPaths(world_.src().c_str(), nullptr,
                                       {.move = 1, .file_index = 1, .index = 1}));
    EXPECT_THAT(world_.TakePlatform(), ElementsAre("MLIBMavoIndexAddEx(NULL, src/object, 4, 0, 0)",
                                                   "MLIBMavoFileIndexAdd(src/object, NULL, 6)",
                                                   "MLIBMavoFileIndexAdd(NULL, NULL, 3)"));
}

// ---- The plain form -----------------------------------------------------------------------------

// Promise: "MAVOEACopy"
TEST_F(CopyDriverTest, TheFormWithoutACopierPassesItsEightArgumentsOn) {
    std::string dst = world_.dst();
    const std::string thumb_to_thumb = "src/@eaDir/object/MAVOThumb, dst/@eaDir/object/MAVOThumb)";
    EXPECT_EQ(0, MAVOEACopy(world_.src().c_str(), dst.data(), 0, 1, 0, 5, 1, 0));
    EXPECT_THAT(
        world_.TakePlatform(),
        ElementsAre("MLIBCExec(/bin/cp, -f, src/._object, dst/._object)",
                    "MAVOGetFSType(dst/@eaDir, 0)", "MAVOACLSetEADirACL(dst/@eaDir)",
                    "MAVOGetFSType(dst/@eaDir/object, 0)", "MAVOACLSetEADirACL(dst/@eaDir/object)",
                    "MLIBCExec(/bin/cp, -f, " + thumb_to_thumb,
                    "MLIBMavoFileIndexAdd(dst/object, NULL, 1)"));
    EXPECT_EQ(0, MAVOEACopy(world_.src().c_str(), dst.data(), 2, 0, 0, 4, 0, 1));
    EXPECT_THAT(world_.TakePlatform(),
                ElementsAre("MLIBMavoIndexAddEx(dst/object, src/object, 4, 0, 0)"));
    EXPECT_EQ(-4, MAVOEACopy(world_.src().c_str(), dst.data(), 0, 0, 13, 0, 0, 0));
    EXPECT_THAT(world_.TakePlatform(), IsEmpty());
}

TEST_F(CopyDriverTest, TheRealCommandsCopyAndMove) {
    Platform().exec = nullptr;
    const Side src = world_.SideAt("src");
    EXPECT_EQ(0, world_.Copy({.src_type = 1, .dst_type = 12}));
    EXPECT_EQ(src, world_.SideAt("src"));
    const Side dst = world_.SideAt("dst");
    EXPECT_EQ(src.at(kResourceFile), dst.at(kResourceFile));
    EXPECT_EQ(src.at(kStreamFile), dst.at(kStreamFile));
    EXPECT_EQ("thumb", dst.at(kThumb));
    EXPECT_EQ(0, world_.Copy({.move = 1, .src_type = 1, .dst_type = 3}));
    EXPECT_EQ(dst, world_.SideAt("dst"));
    EXPECT_FALSE(world_.Has("src/@eaDir"));
    EXPECT_EQ(0777, ModeOf(world_ / "dst/@eaDir/object/MAVOThumb"));
    ExpectNothingReported();
}

TEST_F(CopyDriverTest, ACopyOverMetadataHasItsModeWhateverThatHad) {
    const CopyWorld::Call call = {.src_type = 1, .dst_type = 1};
    ASSERT_EQ(0, world_.Copy(call));
    for (const mode_t mode : {mode_t{0600}, mode_t{04777}, mode_t{0777}}) {
        SCOPED_TRACE(mode);
        for (const char* kind : {"@MavoResource", "@MavoEAStream"}) {
            // The command gives the copy the mode of what it copies.
            for (const char* end : {"src/@eaDir/object", "dst/@eaDir/object"}) {
                ASSERT_EQ(0, chmod((world_ / end).append(kind).c_str(), mode));
            }
        }
        world_.TakeKernel();
        EXPECT_EQ(0, world_.Copy(call));
        const auto calls = world_.TakeKernel();
        for (const char* kind : {"@MavoResource", "@MavoEAStream"}) {
            const std::string path = std::string("dst/@eaDir/object") + kind;
            EXPECT_EQ(0777, ModeOf(world_ / path));
            const auto changes =
                std::count(calls.begin(), calls.end(), "fchmod(" + path + ", 0777)");
            EXPECT_EQ(mode == 0777 ? 0 : 1, changes);
        }
    }
}

// ---- Types that take nothing --------------------------------------------------------------------

// Promise: "MAVOEACopyEx: 0 when"
TEST_F(CopyDriverTest, AnUnsupportedDestinationHasOnlyTheLockCarried) {
    for (const auto& [src, dst] : {std::pair{0, 4}, {5, 12}, {7, 12}, {7, 13}, {1, 8}, {2, 9}}) {
        SCOPED_TRACE(::testing::Message() << src << " to " << dst);
        const Side before = world_.SideAt("src");
        EXPECT_EQ(0, world_.Copy({.move = 1, .copy_eadir = 1, .src_type = src, .dst_type = dst}));
        EXPECT_THAT(world_.TakeKernel(), Contains("access(src/object, 0)"));
        EXPECT_EQ(before, world_.SideAt("src"));
        ExpectNotFinished();
        ExpectNothingReported();
    }
}

TEST_F(CopyDriverTest, AnUnsupportedDestinationWhoseLockFailsGivesMinusFour) {
    // The lock is not carried between empty paths.
    std::string nowhere;
    for (const auto& [src, dst] : {std::pair{0, 4}, {5, 12}, {7, 12}, {7, 13}, {2, 9}}) {
        SCOPED_TRACE(::testing::Message() << src << " to " << dst);
        EXPECT_EQ(-4, CopyWorld::CopyPaths(world_.src().c_str(), nowhere.data(),
                                           {.copy_eadir = 1, .src_type = src, .dst_type = dst}));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_copy_lock")));
        EXPECT_THAT(world_.TakeLines(), IsEmpty());
        EXPECT_EQ(-4, CopyWorld::CopyPaths("", nowhere.data(),
                                           {.move = 1, .src_type = src, .dst_type = dst}));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xD00, "ea_copy_lock")));
        EXPECT_THAT(world_.TakeLines(), IsEmpty());
    }
    ExpectNotFinished();
}

// Promise: "MAVOEACopyEx: -1 or less"
TEST_F(CopyDriverTest, AnUnknownSourceEndsItAtOnce) {
    for (const int type : {4, 8, 9, 11, 12, 13, 14, 100}) {
        SCOPED_TRACE(type);
        EXPECT_EQ(-4, world_.Copy({.copy_eadir = 1, .src_type = type, .dst_type = 1, .index = 1}));
        EXPECT_THAT(world_.TakePlatform(),
                    ElementsAre("MLIBMavoIndexAddEx(dst/object, NULL, 1, 0, 0)"));
        EXPECT_THAT(world_.TakeKernel(), Not(Contains("access(src/object, 0)")));
        ExpectNothingReported();
    }
    ExpectNotFinished();
}

// ---- The lock -----------------------------------------------------------------------------------

TEST_F(CopyDriverTest, ALockThatCannotBeCarriedEndsItWithoutFailingTheCopy) {
    for (const int src : {1, 2, 3, 6, 10}) {
        SCOPED_TRACE(src);
        Platform().file_stat = [](const std::string&, unsigned char*) { return -1; };
        EXPECT_EQ(0, world_.Copy({.copy_eadir = 1, .src_type = src, .dst_type = 1, .index = 1}));
        EXPECT_THAT(world_.TakePlatform(), Contains("MLIBMavoIndexAddEx(dst/object, NULL, 1, 0, "
                                                    "0)"));
        const auto log = world_.TakeLines();
        ASSERT_EQ(1u, log.size());
        EXPECT_TRUE(log[0].starts_with("ea_copy_lock:LINE ")) << log[0];
        ExpectNotFinished();
    }
}

TEST_F(CopyDriverTest, ALockThatCannotBeSetEndsAMoveWithTheSourcesFolderInPlace) {
    for (const auto& [src, dst] : {std::pair{0, 0}, {1, 0}, {2, 5}, {5, 0}, {7, 0}}) {
        CopyWorld world;
        Hooks().chmod = [&](const char* path, mode_t mode) {
            if (path != world.dst()) return ::chmod(path, mode);
            errno = EPERM;
            return -1;
        };
        EXPECT_EQ(0, world.Copy({.move = 1, .copy_eadir = 1, .src_type = src, .dst_type = dst}));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_copy_lock")));
        EXPECT_TRUE(world.Has("src/@eaDir/object/MAVOThumb"));
        EXPECT_TRUE(world.Has("dst/._object"));
        EXPECT_THAT(world.archived, IsEmpty());
    }
}

// Promise: "MAVOEACopyEx: Carries"
TEST_F(CopyDriverTest, ALockedFileIsLockedAtTheOtherEnd) {
    ASSERT_EQ(0, chmod(world_.src().c_str(), 0444));
    EXPECT_EQ(0, world_.Copy({.src_type = 7, .dst_type = 0}));
    EXPECT_EQ(0444, ModeOf(world_.dst()));
    EXPECT_EQ(0, world_.Copy({.src_type = 0, .dst_type = 1}));
    EXPECT_THAT(world_.commands, ElementsAre("dst/object 522"));
}

// ---- Steps that fail: from AppleDouble volumes --------------------------------------------------

TEST_F(CopyDriverTest, AFailedCopyFromAppleDoubleIsToldWithItsOwnResult) {
    Platform().exec = [](const auto&) {
        errno = EIO;
        return -1;
    };
    EXPECT_EQ(-1, world_.Copy({.src_type = 0, .dst_type = 5}));
    const auto log = world_.TakeLines();
    ASSERT_EQ(2u, log.size());
    EXPECT_EQ(CopyFail(EIO), log[1]);
    ExpectNotFinished();
}

// Promise: "MAVOEACopyEx: -1 or less"
TEST_F(CopyDriverTest, ANameTooLongForAnAppleDoubleFileIsToldByItsOwnResult) {
    const std::string name(254, 'n');
    const std::string src = world_ / ("src/" + name);
    const std::string dst = world_ / ("dst/" + name);
    WriteFile(src, Ascii("data"));
    for (const auto& [from, to] : {std::pair{0, 0}, {0, 1}, {1, 0}}) {
        SCOPED_TRACE(::testing::Message() << from << " to " << to);
        std::string path = dst;
        EXPECT_EQ(-3, CopyWorld::CopyPaths(src.c_str(), path.data(),
                                           {.move = 1, .src_type = from, .dst_type = to}));
        const auto log = TakeLog();
        ASSERT_FALSE(log.empty());
        const std::string expected = "EACopy fail: from [" + src + "] to [" + dst + "] ";
        EXPECT_NE(std::string::npos, log.back().find(expected)) << log.back();
        EXPECT_NE(std::string::npos, log.back().find("[0xC300 ea_adpath:")) << log.back();
        EXPECT_THAT(world_.archived, IsEmpty());
    }
}

// Names of 254 bytes have no "._" file, and deriving its path leaves errno alone.
TEST_F(CopyDriverTest, WhatErrnoWasBeforeDecidesNothing) {
    struct Result {
        int value;
        std::vector<int> codes;

        bool operator==(const Result&) const = default;
    };
    const auto copy = [this](const std::string& name, int from, int to, int error) {
        const std::string src = world_ / ("src/" + name);
        std::string dst = world_ / ("dst/" + name);
        WriteFile(src, Ascii("data"));
        WriteFile(dst, Ascii("data"));
        TakeRecords();
        errno = error;
        const int value = MAVOEACopyEx(src.c_str(), dst.data(), 0, 0, from, to, 0, 0, nullptr);
        Result result = {value, {}};
        for (const Record& record : TakeRecords()) result.codes.push_back(record.code);
        TakeLog();
        return result;
    };
    for (const std::size_t size : {1u, 242u, 243u, 253u, 254u, 255u}) {
        const std::string name(size, 'n');
        for (const int from : {0, 1, 2, 7}) {
            for (const int to : {0, 1, 2, 7, 12}) {
                SCOPED_TRACE(::testing::Message() << size << ", " << from << " to " << to);
                const Result expected = copy(name, from, to, 0);
                for (const int error : {ENOENT, ENODATA, EEXIST, ERANGE, ENOTDIR, EINTR}) {
                    EXPECT_TRUE(expected == copy(name, from, to, error)) << strerror(error);
                }
            }
        }
    }
    EXPECT_EQ((Result{-1, {0xC300, 0x900, 0xC300, 0x900}}),
              copy(std::string(254, 'n'), 0, 7, ENOENT));
}

TEST_F(CopyDriverTest, ACopyFromAppleDoubleToFileEANeedsItsAttributes) {
    const auto fail_after = [this](int sets) {
        int left = sets;
        Hooks().setxattr = [this, left](const char* path, const char* name, const void* value,
                                        size_t size, int) mutable {
            if (left-- == 0) {
                errno = EIO;
                return -1;
            }
            const auto* const bytes = static_cast<const std::uint8_t*>(value);
            world_.SetAttribute(path, name, Bytes(bytes, bytes + size));
            return 0;
        };
    };
    // Record, flush time of the sync, flush time.
    for (const auto& [sets, what] :
         {std::pair{0, "ea sync"}, {1, "ea sync"}, {2, "ea write time"}}) {
        SCOPED_TRACE(sets);
        fail_after(sets);
        EXPECT_EQ(-1, world_.Copy({.src_type = 0, .dst_type = 2}));
        EXPECT_THAT(world_.TakeLines(), ElementsAre(Failed(what, EIO), CopyFail(EIO)));
        EXPECT_TRUE(world_.Has("dst/@eaDir/object@MavoResource"));  // Nothing is undone.
        ExpectNotFinished();
    }
}

// ---- Steps that fail: from real attributes ------------------------------------------------------

TEST_F(CopyDriverTest, AttributesThatCannotBeListedFailTheCopy) {
    for (const int dst : {0, 5, 7, 1, 2}) {
        SCOPED_TRACE(dst);
        const FailCall fault("listxattr", EIO);
        EXPECT_EQ(-1, world_.Copy({.move = 1, .src_type = 7, .dst_type = dst}));
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, "ea_xattr_enum")));
        if (dst == 2) {
            EXPECT_THAT(world_.TakeLines(),
                        ElementsAre(Failed("to cp", EIO), Failed("to cp", EIO), CopyFail(EIO)));
        } else {
            EXPECT_THAT(world_.TakeLines(), ElementsAre(Failed("to cp", EIO), CopyFail(EIO)));
        }
        EXPECT_TRUE(world_.Has("src/@eaDir/object@MavoResource"));
        ExpectNotFinished();
    }
}

TEST_F(CopyDriverTest, TwoAttributesThatFailAreOneFailureOfTheCopy) {
    // The routine counts them, down from -1; the driver's own step gives -1.
    Hooks().getxattr = [](const char*, const char*, void*, size_t) {
        errno = EACCES;
        return ssize_t{-1};
    };
    for (const int dst : {0, 7, 1, 2}) {
        EXPECT_EQ(-1, world_.Copy({.src_type = 7, .dst_type = dst}));
    }
}

// Promise: "MAVOEACopyEx: on types 7"
TEST_F(CopyDriverTest, OnlyAMoveOfOneRemovesTheResourceFileOfASourceWithAttributes) {
    for (const int dst : {0, 5, 7}) {
        for (const int move : {-1, 0, 2, 3}) {
            const FailCall fault("unlink", EIO, 0);
            EXPECT_EQ(0, world_.Copy({.move = move, .src_type = 7, .dst_type = dst}));
            EXPECT_TRUE(world_.Has("src/@eaDir/object@MavoResource"));
            EXPECT_THAT(world_.TakeLines(), IsEmpty());
            if (move != 0) world_.Put("src/@eaDir/object/MAVOThumb", Ascii("thumb"));
        }
        (void)TakeRecords();
        {
            const FailCall fault("unlink", EIO);
            EXPECT_EQ(-1, world_.Copy({.move = 1, .src_type = 7, .dst_type = dst}));
            EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x2A00, kUnit)));
            EXPECT_THAT(world_.TakeLines(), ElementsAre(Failed("to remove", EIO), CopyFail(EIO)));
        }
        // One that is missing is as good as removed.
        world_.Remove("src/@eaDir/object@MavoResource");
        EXPECT_EQ(0, world_.Copy({.move = 1, .src_type = 7, .dst_type = dst}));
        EXPECT_THAT(world_.TakeLines(), IsEmpty());
        world_.Put("src/@eaDir/object@MavoResource", Ascii("resource"));
        (void)TakeRecords();
    }
}

TEST_F(CopyDriverTest, AnAttributeSourceWhoseResourceFileHasNoPathFailsTheMove) {
    std::string src = world_.src();
    while (src.size() < 4085) src.insert(src.rfind('/'), "/.");
    std::string dst = world_.dst();
    EXPECT_EQ(0, CopyWorld::CopyPaths(src.c_str(), dst.data(),
                                      {.move = 2, .src_type = 7, .dst_type = 4}));
    EXPECT_EQ(0, CopyWorld::CopyPaths(src.c_str(), dst.data(),
                                      {.move = 2, .src_type = 7, .dst_type = 7}));
    (void)TakeRecords();
    (void)TakeLog();
    EXPECT_EQ(-1, CopyWorld::CopyPaths(src.c_str(), dst.data(),
                                       {.move = 1, .src_type = 7, .dst_type = 7}));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0xC300, "ea_path")));
    const auto log = TakeLog();
    ASSERT_EQ(3u, log.size());
    EXPECT_EQ("ea_copy.c:LINE Fail to generate path of " + src + ".", log[0]);
    EXPECT_TRUE(log[1].starts_with(Wrapped("Failed to remove [" + src + "]->[" + dst + "]. ")));
    EXPECT_TRUE(log[2].starts_with(Wrapped("EACopy fail: from [" + src + "] to [" + dst + "] ")));
}

TEST_F(CopyDriverTest, ACopyFromAttributesToFileEANeedsItsAttributes) {
    for (const auto& [sets, what] :
         {std::pair{0, "ea sync"}, {1, "ea sync"}, {2, "ea write time"}}) {
        SCOPED_TRACE(sets);
        CopyWorld world;
        const FailCall fault("setxattr", EDQUOT, sets + 1);
        EXPECT_EQ(-1, world.Copy({.src_type = 7, .dst_type = 2}));
        EXPECT_THAT(world.TakeLines(), ElementsAre(Failed(what, EDQUOT), CopyFail(EDQUOT)));
        EXPECT_TRUE(world.Has("dst/@eaDir/object@MavoResource"));
        EXPECT_THAT(world.archived, IsEmpty());
        EXPECT_THAT(world.commands, IsEmpty());
    }
}

// ---- Steps that fail: from EA directories -------------------------------------------------------

TEST_F(CopyDriverTest, LegacyLayoutsThatCannotBeUpgradedAreLoggedAndTheCopyGoesOn) {
    for (const auto& [src, dst] : {std::pair{1, 1}, {3, 12}, {6, 7}, {10, 2}, {1, 4}}) {
        SCOPED_TRACE(::testing::Message() << src << " to " << dst);
        CopyWorld world;
        world.Remove("src/@eaDir/object@MavoResource");
        world.Remove("src/@eaDir/object@MavoEAStream");
        world.Put("src/@eaDir/object/MAVO:Resource", Ascii("resource"));
        {
            const FailCall fault("rename", EIO, 0);
            EXPECT_EQ(0, world.Copy({.src_type = src, .dst_type = dst}));
        }
        const auto records = TakeRecords();
        ASSERT_LE(2u, records.size());
        const auto told = [&](const Record& record) {
            EXPECT_THAT(record, RecordOf(0x2800, "ea_upgrade"));
            return "[0x2800 ea_upgrade:" + std::to_string(record.line) + "]";
        };
        const auto log = world.TakeLines();
        ASSERT_EQ(2u, log.size());
        EXPECT_EQ("ea_copy.c:LINE Fail to upgrde MavoResource of src/object." + told(records[0]),
                  log[0]);
        EXPECT_EQ("ea_copy.c:LINE Fail to upgrde eastream of src/object." + told(records[1]),
                  log[1]);
    }
}

// Promise: "Copying: The source is changed"
TEST_F(CopyDriverTest, OnlySourcesWithEADirectoriesAloneAreUpgraded) {
    for (const int src : {2, 7, 0}) {
        CopyWorld world;
        world.Remove("src/@eaDir/object@MavoResource");
        world.Remove("src/@eaDir/object@MavoEAStream");
        world.Put("src/@eaDir/object/MAVO:Resource", Ascii("resource"));
        world.ClearAttributes(world.src());
        EXPECT_EQ(0, world.Copy({.src_type = src, .dst_type = src}));
        EXPECT_FALSE(world.Has("src/@eaDir/object@MavoResource"));
        EXPECT_TRUE(world.Has("src/@eaDir/object/MAVO:Resource"));
    }
    for (const int src : {1, 3, 6, 10}) {
        CopyWorld world;
        world.Remove("src/@eaDir/object@MavoResource");
        world.Remove("src/@eaDir/object@MavoEAStream");
        world.Put("src/@eaDir/object/MAVO:Resource", Ascii("resource"));
        EXPECT_EQ(0, world.Copy({.src_type = src, .dst_type = 4}));
        EXPECT_EQ(Ascii("resource"), ReadFile(world / "src/@eaDir/object@MavoResource"));
        // The "._" file became the stream.
        EXPECT_TRUE(world.Has("src/@eaDir/object@MavoEAStream"));
        EXPECT_FALSE(world.Has("src/._object"));
    }
}

// Promise: "MAVOEACopyEx: -1 or less"
TEST_F(CopyDriverTest, AFailedCopyOfAnEADirectoryFileIsTheCopysResult) {
    const std::string cp =
        "Failed to cp -f src/@eaDir/object@MavoResource dst/@eaDir/object@MavoResource. ";
    for (const int dst : {1, 3, 6, 10, 12}) {
        for (const bool with_copier : {false, true}) {
            SCOPED_TRACE(dst);
            Platform().exec = [](const auto&) {
                errno = ENOSPC;
                return -1;
            };
            world_.copier = [](const auto&, const auto&) {
                errno = ENOSPC;
                return -5;
            };
            EXPECT_EQ(-1,
                      world_.Copy(
                          {.move = 1, .src_type = 1, .dst_type = dst, .with_copier = with_copier}));
            EXPECT_THAT(world_.TakeLines(), ElementsAre(Wrapped(cp + strerror(ENOSPC)),
                                                        Failed("to cp", ENOSPC), CopyFail(ENOSPC)));
            ExpectNotFinished();
        }
    }
    EXPECT_THAT(world_.copied, ::testing::SizeIs(5));
}

// Promise: "MAVOEACopyEx: -1 or less"
TEST_F(CopyDriverTest, NamesThatClientsDoNotTakeAreToldByTheirOwnResults) {
    for (const auto& [name, result] : {std::pair{"._Icon\r", -32}, {"._a?b", -33}}) {
        Platform().fat_replace = [name = std::string(name)](const auto&) { return name; };
        EXPECT_EQ(result, world_.Copy({.move = 1, .src_type = 1, .dst_type = 0, .index = 1}));
        const auto log = world_.TakeLines();
        ASSERT_EQ(2u, log.size());
        EXPECT_NE(std::string::npos,
                  log[1].find("EACopy fail: from [src/object] to [dst/object] "));
        EXPECT_THAT(world_.TakePlatform(),
                    Contains("MLIBMavoIndexAddEx(dst/object, src/object, 4, 0, 0)"));
        ExpectNotFinished();
        // A driver's step of its own does not hand it on.
        EXPECT_EQ(-1, world_.Copy({.src_type = 2, .dst_type = 0}));
        (void)TakeLog();
    }
}

// ---- Steps that fail: from file-EA volumes ------------------------------------------------------

TEST_F(CopyDriverTest, AFileEASourceWhoseFinderInfoCannotBeSyncedFails) {
    for (const int dst : {0, 5, 7, 1, 3, 6, 10, 12}) {
        SCOPED_TRACE(dst);
        const FailCall fault("getxattr", EIO);
        EXPECT_EQ(-1, world_.Copy({.move = 1, .src_type = 2, .dst_type = dst}));
        const auto log = world_.TakeLines();
        ASSERT_LE(2u, log.size());
        EXPECT_EQ(Failed("file sync", EIO), log[log.size() - 2]);
        EXPECT_EQ(CopyFail(EIO), log.back());
        EXPECT_TRUE(world_.Has("src/@eaDir/object@MavoResource"));
        ExpectNotFinished();
    }
}

TEST_F(CopyDriverTest, AFileEASourceWhoseFilesCannotBeCopiedFails) {
    Platform().exec = [](const auto&) {
        errno = EIO;
        return -1;
    };
    const std::string cp =
        "Failed to cp -f src/@eaDir/object@MavoResource dst/@eaDir/object@MavoResource. ";
    for (const int dst : {1, 3, 6, 10, 12, 2}) {
        SCOPED_TRACE(dst);
        EXPECT_EQ(-1, world_.Copy({.move = 1, .src_type = 2, .dst_type = dst}));
        EXPECT_THAT(world_.TakeLines(),
                    ElementsAre(Wrapped(cp + strerror(EIO)), Failed("to cp", EIO),
                                Failed("to cp", EIO), CopyFail(EIO)));
        ExpectNotFinished();
    }
    // To attributes.
    const FailCall fault("setxattr", ENOSPC);
    EXPECT_EQ(-1, world_.Copy({.src_type = 2, .dst_type = 7}));
    EXPECT_THAT(world_.TakeLines(),
                ElementsAre(Failed("to cp", ENOSPC), Failed("to cp", ENOSPC), CopyFail(ENOSPC)));
}

TEST_F(CopyDriverTest, ARecordThatCannotBeRemovedFailsTheMove) {
    for (const int dst : {0, 7, 1, 12}) {
        for (const int move : {1, 2}) {
            SCOPED_TRACE(dst);
            CopyWorld world;
            const FailCall fault("removexattr", EPERM);
            EXPECT_EQ(-1, world.Copy({.move = move, .src_type = 2, .dst_type = dst}));
            EXPECT_THAT(world.TakeLines(),
                        ElementsAre(Wrapped(std::string("remove xattr from [src/object] ") +
                                            strerror(EPERM)),
                                    CopyFail(EPERM)));
            EXPECT_THAT(world.archived, IsEmpty());
            EXPECT_TRUE(world.Has("src/@eaDir/object/MAVOThumb"));
            EXPECT_TRUE(world.SideAt("src").contains("attribute user.netatalk.Metadata"));
        }
        CopyWorld world;
        EXPECT_EQ(0, world.Copy({.src_type = 2, .dst_type = dst}));
        for (const std::string& call : TakeCallNames()) EXPECT_NE("removexattr", call);
    }
}

TEST_F(CopyDriverTest, ARecordThatIsNotThereIsAsGoodAsRemoved) {
    for (const int dst : {0, 7, 1, 12}) {
        for (const int error : {ENODATA, ENOENT}) {
            CopyWorld world;
            const FailCall fault("removexattr", error);
            EXPECT_EQ(0, world.Copy({.move = 1, .src_type = 2, .dst_type = dst}));
            EXPECT_TRUE(fault.fired());
            EXPECT_THAT(world.TakeLines(), IsEmpty());
            EXPECT_THAT(world.archived, ElementsAre("dst/object"));
        }
    }
}

TEST_F(CopyDriverTest, BetweenFileEAVolumesTheSyncAndItsTimeAreOnlyLogged) {
    const auto every = [](const std::string& wanted) {
        Hooks().setxattr = [wanted](const char*, const char* name, const void*, size_t, int) {
            if (name != wanted) return 0;
            errno = EROFS;
            return -1;
        };
    };
    every(kRecordAttribute);
    EXPECT_EQ(0, world_.Copy({.src_type = 2, .dst_type = 2}));
    EXPECT_THAT(world_.TakeLines(), ElementsAre(Failed("ea sync", EROFS)));
    EXPECT_THAT(world_.commands, ElementsAre("dst/object 522"));
    ExpectFinished();
    EXPECT_TRUE(world_.Has("dst/@eaDir/object/MAVOThumb"));

    CopyWorld world;
    const FailCall fault("setxattr", EROFS, 0);
    EXPECT_EQ(0, world.Copy({.move = 1, .src_type = 2, .dst_type = 2}));
    const auto log = world.TakeLines();
    ASSERT_EQ(2u, log.size());
    EXPECT_NE(std::string::npos, log[0].find("Failed ea sync [src/object]->[dst/object]. "));
    EXPECT_EQ(Failed("ea write time", EROFS), log[1]);
    EXPECT_THAT(world.archived, ElementsAre("dst/object"));
    EXPECT_FALSE(world.Has("src/@eaDir"));
}

TEST_F(CopyDriverTest, BetweenFileEAVolumesTheCopierCopiesOnlyWhatIsCarriedOver) {
    EXPECT_EQ(0, world_.Copy({.src_type = 2, .dst_type = 2, .with_copier = true}));
    EXPECT_THAT(world_.copied,
                ElementsAre("src/@eaDir/object/MAVOThumb dst/@eaDir/object/MAVOThumb"));
}

// ---- Any step that fails ------------------------------------------------------------------------

TEST_F(CopyDriverTest, WhicheverCallFailsAFailedCopySaysSoAndNothingLeaks) {
    const auto working_directory = std::filesystem::current_path();
    for (const int src : {0, 1, 2, 3, 7}) {
        for (const int dst : {0, 1, 2, 7, 12}) {
            for (int nth = 1, fired = 1; fired != 0; nth += kSeriesStep) {
                CopyWorld world;
                int result = 0;
                std::string name;
                {
                    const FailNthCall fault(nth, EIO);
                    result =
                        world.Copy({.move = 1, .copy_eadir = 1, .src_type = src, .dst_type = dst});
                    fired = fault.fired() ? 1 : 0;
                    name = fault.name();
                }
                SCOPED_TRACE(::testing::Message()
                             << src << " to " << dst << ", call " << nth << ", " << name);
                // Only the way back itself cannot be made up for.
                if (name != "fchdir") {
                    EXPECT_EQ(working_directory, std::filesystem::current_path());
                }
                std::filesystem::current_path(working_directory);
                const auto log = world.TakeLines();
                const bool told =
                    !log.empty() && log.back().find(
                                        "]EACopy fail: from ["
                                        "src/object] to [dst/object] ") != std::string::npos;
                EXPECT_EQ(result < 0, told) << ::testing::PrintToString(log);
                EXPECT_GE(0, result);
                if (result < 0) {
                    EXPECT_THAT(world.archived, IsEmpty());
                }
                ASSERT_GT(2000, nth);
            }
        }
    }
}

TEST_F(CopyDriverTest, EmptyPathsAreNoPaths) {
    for (int src = 0; src <= 13; ++src) {
        for (int dst = 0; dst <= 13; ++dst) {
            for (const int move : {0, 1}) {
                std::string nowhere;
                const CopyWorld::Call call = {
                    .move = move, .copy_eadir = 1, .src_type = src, .dst_type = dst};
                EXPECT_GE(0, CopyWorld::CopyPaths("", nowhere.data(), call));
                std::string path = world_.dst();
                EXPECT_GE(0, CopyWorld::CopyPaths("", path.data(), call));
            }
        }
    }
}

// ---- Attribute by attribute ---------------------------------------------------------------------

class AttributeCopyTest : public CopyDriverTest {
 protected:
    AttributeCopyTest() {
        world_.ClearAttributes(world_.src());
        world_.Remove("src/@eaDir");
    }
    int Copy() { return world_.Copy({.src_type = 7, .dst_type = 7}); }
    std::vector<std::string> TakeGets() {
        std::vector<std::string> calls = world_.TakeKernel();
        std::erase_if(calls, [](const std::string& call) { return !call.starts_with("getxattr"); });
        return calls;
    }
    std::string Attribute(const std::string& name) {
        const Side dst = world_.SideAt("dst");
        const auto found = dst.find("attribute " + name);
        return found == dst.end() ? "(none)" : found->second;
    }
};

TEST_F(AttributeCopyTest, AllAreCopiedInOrderAndSyncedOnce) {
    world_.SetAttribute(world_.src(), "user.b", Ascii("2"));
    world_.SetAttribute(world_.src(), "user.a", Ascii("1"));
    world_.SetAttribute(world_.src(), "user.empty", {});
    world_.SetAttribute(world_.dst(), "user.a", Ascii("longer than before"));
    world_.SetAttribute(world_.dst(), "user.mine", Ascii("stays"));
    EXPECT_EQ(0, Copy());
    auto calls = world_.TakeKernel();
    std::erase_if(calls, [](const std::string& call) {
        return !call.starts_with("setxattr") && !call.starts_with("sync");
    });
    EXPECT_THAT(calls, ElementsAre("setxattr(dst/object, user.b, 1, 0)",
                                   "setxattr(dst/object, user.a, 1, 0)",
                                   "setxattr(dst/object, user.empty, 0, 0)", "sync()"));
    EXPECT_EQ("1", Attribute("user.a"));
    EXPECT_EQ("", Attribute("user.empty"));
    EXPECT_EQ("stays", Attribute("user.mine"));
    ExpectNothingReported();
}

TEST_F(AttributeCopyTest, NoAttributesAreNoFailure) {
    EXPECT_EQ(0, Copy());
    EXPECT_THAT(TakeGets(), IsEmpty());
    ExpectFinished();
}

TEST_F(AttributeCopyTest, TheBufferGrowsToALongValueAndStaysThatLarge) {
    const Bytes edge = Pattern(1024, 1);
    const Bytes large = Pattern(5000, 2);
    const Bytes medium = Pattern(3000, 3);
    const Bytes larger = Pattern(5001, 4);
    world_.SetAttribute(world_.src(), "user.edge", edge);
    world_.SetAttribute(world_.src(), "user.large", large);
    world_.SetAttribute(world_.src(), "user.medium", medium);
    world_.SetAttribute(world_.src(), "user.larger", larger);
    EXPECT_EQ(0, Copy());
    EXPECT_THAT(
        TakeGets(),
        ElementsAre(
            "getxattr(src/object, user.edge, 1024)", "getxattr(src/object, user.large, 1024)",
            "getxattr(src/object, user.large, 0)", "getxattr(src/object, user.large, 5000)",
            "getxattr(src/object, user.medium, 5000)", "getxattr(src/object, user.larger, 5000)",
            "getxattr(src/object, user.larger, 0)", "getxattr(src/object, user.larger, 5001)"));
    EXPECT_EQ(Text(edge), Attribute("user.edge"));
    EXPECT_EQ(Text(large), Attribute("user.large"));
    EXPECT_EQ(Text(medium), Attribute("user.medium"));
    EXPECT_EQ(Text(larger), Attribute("user.larger"));
    ExpectNothingReported();
}

TEST_F(AttributeCopyTest, AValueThatGrewAgainIsAFailureThatStopsNothing) {
    world_.SetAttribute(world_.src(), "user.moving", Pattern(2000));
    world_.SetAttribute(world_.src(), "user.last", Ascii("last"));
    const auto get = Hooks().getxattr;
    Hooks().getxattr = [get](const char* path, const char* name, void* value, size_t size) {
        if (std::string(name) != "user.moving" || size == 0) return get(path, name, value, size);
        errno = ERANGE;
        return ssize_t{-1};
    };
    EXPECT_EQ(-1, Copy());
    EXPECT_EQ("last", Attribute("user.last"));
    EXPECT_EQ("(none)", Attribute("user.moving"));
    const auto log = world_.TakeLines();
    ASSERT_EQ(3u, log.size());
    EXPECT_EQ(Wrapped(std::string("Fail to get EA(src/object, user.moving). ") + strerror(ERANGE)),
              log[0]);
    EXPECT_NE(std::string::npos, log[1].find("Failed to cp [src/object]->[dst/object]. "));
    EXPECT_NE(std::string::npos, log[2].find("EACopy fail: from [src/object] to [dst/object] "));
    for (const std::string& name : TakeCallNames()) EXPECT_NE("sync", name);
    EXPECT_THAT(world_.archived, IsEmpty());
}

TEST_F(AttributeCopyTest, AValueThatCannotBeReadIsAFailureThatStopsNothing) {
    world_.SetAttribute(world_.src(), "user.first", Ascii("first"));
    world_.SetAttribute(world_.src(), "user.last", Ascii("last"));
    {
        const FailCall fault("getxattr", EACCES);
        EXPECT_EQ(-1, Copy());
    }
    EXPECT_EQ("(none)", Attribute("user.first"));
    EXPECT_EQ("last", Attribute("user.last"));
    const auto log = world_.TakeLines();
    ASSERT_EQ(3u, log.size());
    EXPECT_EQ(Wrapped(std::string("Fail to get EA(src/object). ") + strerror(EACCES)), log[0]);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(AttributeCopyTest, AValueThatCannotBeSetIsAFailureThatStopsNothing) {
    world_.SetAttribute(world_.src(), "user.first", Ascii("first"));
    world_.SetAttribute(world_.src(), "user.last", Ascii("last"));
    {
        const FailCall fault("setxattr", ENOSPC);
        EXPECT_EQ(-1, Copy());
    }
    EXPECT_EQ("(none)", Attribute("user.first"));
    EXPECT_EQ("last", Attribute("user.last"));
    const auto log = world_.TakeLines();
    ASSERT_EQ(3u, log.size());
    EXPECT_EQ(Wrapped(std::string("Fail to set EA(dst/object, user.first). ") + strerror(ENOSPC)),
              log[0]);
    EXPECT_THAT(TakeRecords(), IsEmpty());
}

TEST_F(AttributeCopyTest, ABufferThatCannotGrowIsAFailureThatStopsNothing) {
    world_.SetAttribute(world_.src(), "user.large", Pattern(5000));
    world_.SetAttribute(world_.src(), "user.last", Ascii("last"));
    std::optional<FailCall> fault;
    const auto get = Hooks().getxattr;
    Hooks().getxattr = [&](const char* path, const char* name, void* value, size_t size) {
        if (size == 0 && !fault) fault.emplace("malloc", ENOMEM);
        return get(path, name, value, size);
    };
    EXPECT_EQ(-1, Copy());
    ASSERT_TRUE(fault.has_value());
    EXPECT_TRUE(fault->fired());
    EXPECT_EQ("(none)", Attribute("user.large"));
    EXPECT_EQ("last", Attribute("user.last"));
    EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(0x100, kUnit)));
    EXPECT_THAT(world_.TakeLines(),
                ::testing::SizeIs(2));  // The copy's two lines, none of its own.
}

TEST_F(AttributeCopyTest, AttributesThatDoNotFitTheListFailTheCopy) {
    world_.SetAttribute(world_.src(), "user.a", Ascii("1"));
    Platform().pushes_until_failure = 0;
    EXPECT_EQ(-1, Copy());
    EXPECT_THAT(TakeGets(), IsEmpty());
    EXPECT_THAT(world_.TakeLines(), ::testing::SizeIs(2));
}

// ---- The indexes --------------------------------------------------------------------------------

// Ways for a copy to end, all of which are told to the indexes.
struct WayOut {
    const char* name;
    int src_type;
    int dst_type;
    int result;
    std::function<void(CopyWorld& world)> prepare;
};

std::vector<WayOut> WaysOut() {
    const auto nothing = [](CopyWorld&) {};
    const auto fail_lists = [](CopyWorld&) {
        Hooks().listxattr = [](const char*, char*, size_t) {
            errno = EIO;
            return ssize_t{-1};
        };
    };
    return {
        {"done", 1, 1, 0, nothing},
        {"source type not told", -1, 1, -1, [](CopyWorld& world) { world.src_type = -1; }},
        {"destination type not told", 1, -1, -1, [](CopyWorld& world) { world.dst_type = -1; }},
        {"source type unknown", 4, 1, -4, nothing},
        {"destination type unsupported", 1, 4, 0, nothing},
        {"copy failed", 7, 7, -1, fail_lists},
        {"lock failed", 1, 1, 0,
         [](CopyWorld&) {
             Platform().file_stat = [](const std::string&, unsigned char*) { return -1; };
         }},
        {"no folder", 1, 1, 0, [](CopyWorld& world) { world.Remove("src/@eaDir/object"); }},
    };
}

// Promise: "MAVOEACopyEx: updateFileIndex"
TEST(CopyIndexTest, EveryWayOutIsToldToTheIndexesThatAreAskedFor) {
    for (const WayOut& way : WaysOut()) {
        for (const int move : {0, 1, 2}) {
            for (const int index : {0, 1, 5}) {
                for (const int file_index : {0, 1, 5}) {
                    SCOPED_TRACE(::testing::Message() << way.name << ", move " << move);
                    CopyWorld world;
                    way.prepare(world);
                    EXPECT_EQ(way.result, world.Copy({.move = move,
                                                      .src_type = way.src_type,
                                                      .dst_type = way.dst_type,
                                                      .file_index = file_index,
                                                      .index = index}));
                    auto calls = world.TakePlatform();
                    std::erase_if(calls, [](const std::string& call) {
                        return !call.starts_with("MLIBMavo");
                    });
                    std::vector<std::string> expected;
                    if (index != 0) {
                        expected.push_back(
                            move != 0 ? "MLIBMavoIndexAddEx(dst/object, src/object, 4, 0, 0)"
                                      : "MLIBMavoIndexAddEx(dst/object, NULL, 1, 0, 0)");
                    }
                    if (file_index != 0 && move != 0) {
                        expected.push_back("MLIBMavoFileIndexAdd(src/object, NULL, 6)");
                        expected.push_back("MLIBMavoFileIndexAdd(dst/object, NULL, 3)");
                    } else if (file_index != 0) {
                        expected.push_back("MLIBMavoFileIndexAdd(dst/object, NULL, 1)");
                    }
                    EXPECT_EQ(expected, calls);
                }
            }
        }
    }
}

TEST(CopyIndexTest, ADirectoryIsToldToTheSearchIndexAsOne) {
    for (const int src_type : {1, 4, 0}) {
        for (const int move : {0, 1}) {
            CopyWorld world;
            world.Remove("dst/object");
            ASSERT_TRUE(std::filesystem::create_directory(world.dst()));
            (void)world.Copy(
                {.move = move, .src_type = src_type, .dst_type = 4, .file_index = 1, .index = 1});
            if (move == 0) {
                EXPECT_THAT(world.TakePlatform(),
                            ElementsAre("MLIBMavoIndexAddEx(dst/object, NULL, 3, 0, 0)",
                                        "MLIBMavoFileIndexAdd(dst/object, NULL, 1)"));
            } else {
                EXPECT_THAT(world.TakePlatform(),
                            ElementsAre("MLIBMavoIndexAddEx(dst/object, src/object, 4, 0, 0)",
                                        "MLIBMavoFileIndexAdd(src/object, NULL, 6)",
                                        "MLIBMavoFileIndexAdd(dst/object, NULL, 3)"));
            }
        }
    }
}

TEST(CopyIndexTest, ADestinationThatIsMissingOrALinkToADirectoryIsToldAsStatSeesIt) {
    CopyWorld world;
    world.Remove("dst/object");
    EXPECT_EQ(-4, world.Copy({.src_type = 4, .dst_type = 1, .index = 1}));
    EXPECT_THAT(world.TakePlatform(), ElementsAre("MLIBMavoIndexAddEx(dst/object, NULL, 1, 0, 0)"));
    std::filesystem::create_directory_symlink(world / "src", world.dst());
    EXPECT_EQ(-4, world.Copy({.src_type = 4, .dst_type = 1, .index = 1}));
    EXPECT_THAT(world.TakePlatform(), ElementsAre("MLIBMavoIndexAddEx(dst/object, NULL, 3, 0, 0)"));
}

TEST(CopyIndexTest, WhatTheIndexesAnswerIsIgnored) {
    CopyWorld world;
    Platform().index = [](const std::string&) { return -1; };
    EXPECT_EQ(0, world.Copy({.src_type = 1, .dst_type = 1, .file_index = 1, .index = 1}));
    EXPECT_EQ(0,
              world.Copy({.move = 1, .src_type = 1, .dst_type = 1, .file_index = 1, .index = 1}));
    ExpectNothingReported();
}

}  // namespace
}  // namespace mavoea::test

// Converting what earlier versions kept for an object: attribute files in a folder of its own, a
// resource file and other reserved files in the same folder, a "._" file beside the object.

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/fake_platform.h"
#include "tests/support/freed_descriptor.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/support/stream_fixture.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

constexpr char kStream[] = "MavoEAStream";
constexpr char kResource[] = "MavoResource";
constexpr char kUnit[] = "ea_upgrade";
constexpr uid_t kUser = 1000;

using Values = std::map<std::string, Bytes>;

// Sets the access time and nothing else.
void SetAccess(const std::string& path, time_t seconds, long nanoseconds = 0) {
    const struct timespec times[2] = {{.tv_sec = seconds, .tv_nsec = nanoseconds},
                                      {.tv_sec = 0, .tv_nsec = UTIME_OMIT}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, 0)) << path << ": " << strerror(errno);
}

void SetModification(const std::string& path, time_t seconds) {
    const struct timespec times[2] = {{.tv_sec = 0, .tv_nsec = UTIME_OMIT},
                                      {.tv_sec = seconds, .tv_nsec = 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, 0)) << path << ": " << strerror(errno);
}

std::string CurrentDirectory() {
    char path[4096];
    return getcwd(path, sizeof path) == nullptr ? strerror(errno) : path;
}

// Which directory "." is, wherever it is called.
std::pair<dev_t, ino_t> CurrentInode() {
    struct stat info;
    return stat(".", &info) == 0 ? std::pair{info.st_dev, info.st_ino}
                                 : std::pair{dev_t{}, ino_t{}};
}

// What a file holds that should be there.
Bytes ContentsOf(const std::string& path) {
    return Exists(path) ? ReadFile(path) : Ascii("(missing)");
}

Bytes SmallSidecar() {
    StreamImage image;
    image.attributes = {{"from a Mac", Ascii("yes")}};
    image.fork = Ascii("a fork");
    image.finder_info = Pattern(32, 9);
    return image.Build();
}

class EaUpgradeTest : public ::testing::Test, protected Identity {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        Hooks().fsync = [](int) { return 0; };  // The disk need not spin.
        Hooks().command = [](const char*, int) { return 0; };
        BeUser(0);
        WriteFile(object_, Ascii("data"));
        ASSERT_EQ(0, chmod(object_.c_str(), 0644));
        started_in_ = ::open(".", O_PATH | O_DIRECTORY);
        ASSERT_LE(0, started_in_);
        ASSERT_EQ(0, chdir(cwd_.path().c_str()));
        live_blocks_ = TakeAllocations().live;
        descriptors_ = OpenDescriptors();
    }

    // Whatever a test did, it ends in the directory in which it began.
    void TearDown() override {
        EXPECT_EQ(cwd_.path(), CurrentDirectory());
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        EXPECT_EQ(descriptors_, OpenDescriptors());
        EXPECT_EQ(0, fchdir(started_in_));
        ::close(started_in_);
        ResetKernel();
        ResetPlatform();
    }

    static void ExpectOnly(int code, const std::string& unit) {
        EXPECT_THAT(TakeRecords(), ElementsAre(RecordOf(code, unit)));
    }

    static std::vector<int> TakeCodes() {
        std::vector<int> codes;
        for (const Record& record : TakeRecords()) codes.push_back(record.code);
        return codes;
    }

    // A legacy folder with these files, all of which were last read at `seconds`.
    void MakeFolder(const Values& files, time_t seconds = 100) const {
        std::filesystem::create_directories(folder_);
        // As the library makes them: open to everyone.
        ASSERT_EQ(0, chmod(ea_dir_.c_str(), 0777));
        ASSERT_EQ(0, chmod(folder_.c_str(), 0777));
        for (const auto& [name, value] : files) {
            const std::string path = folder_ + "/" + name;
            WriteFile(path, value);
            SetAccess(path, seconds);
        }
    }

    void MakeSidecar(const Bytes& bytes, time_t seconds) const {
        WriteFile(sidecar_, bytes);
        SetAccess(sidecar_, seconds);
    }

    void MakeStream(const Bytes& bytes) const {
        std::filesystem::create_directories(ea_dir_);
        WriteFile(stream_, bytes);
    }

    int UpgradeStream() const { return MAVOEAUpgrade(object_.c_str(), kStream); }

    // The attributes of the stream; none when there is none, or when it is new.
    static Values InStream(const std::string& path) {
        if (!Exists(path)) return {};
        const Bytes bytes = ReadFile(path);
        if (bytes.empty()) return {};
        const auto contents = ReadMacFile(bytes);
        EXPECT_TRUE(contents) << "damaged: " << path;
        return contents ? contents->attributes : Values{};
    }
    Values InStream() const { return InStream(stream_); }

    // The regular files of the legacy folder.
    Values InFolder() const {
        Values files;
        if (!std::filesystem::is_directory(folder_)) return files;
        for (const auto& entry : std::filesystem::directory_iterator(folder_)) {
            if (!entry.is_regular_file()) continue;
            files[entry.path().filename().string()] = ReadFile(entry.path().string());
        }
        return files;
    }

    // Every attribute is in its file or in the stream.
    void ExpectNothingLost(const Values& values) const {
        const Values stream = InStream();
        const Values folder = InFolder();
        for (const auto& [name, value] : values) {
            const auto in_stream = stream.find(name);
            const auto in_folder = folder.find(name);
            EXPECT_TRUE((in_stream != stream.end() && in_stream->second == value) ||
                        (in_folder != folder.end() && in_folder->second == value))
                << name;
        }
    }

    // Leaves the object alone in its directory.
    void StartAgain() const {
        ASSERT_EQ(0, chdir(cwd_.path().c_str()));
        for (const std::string& name : NamesIn(dir_.path())) {
            std::filesystem::remove_all(dir_ / name);
        }
        WriteFile(object_, Ascii("data"));
        ASSERT_EQ(0, chmod(object_.c_str(), 0644));
        TakeRecords();
        TakeLog();
        TakeCalls();
        TakePlatformCalls();
    }

    // Which of the calls of that name, from 1, is the first whose arguments contain `text`, when
    // the stream is upgraded from what `make` makes. Starts again afterwards.
    int WhichCall(const std::string& name, const std::string& text,
                  const std::function<void()>& make) const {
        StartAgain();
        make();
        TakeCalls();
        UpgradeStream();
        int nth = 0;
        for (const std::string& call : TakeCalls()) {
            if (!call.starts_with(name + "(")) continue;
            ++nth;
            if (call.find(text) != std::string::npos) break;
        }
        StartAgain();
        make();
        TakeCalls();
        return nth;
    }

    // An object path of `size` bytes that leads to object_.
    std::string LongPathToObject(std::size_t size) const {
        const std::string end = "/a.txt";
        std::string path = dir_.path();
        if ((size - path.size() - end.size()) % 2 != 0) path += "/";
        while (path.size() + end.size() < size) path += "/.";
        return path + end;
    }

    void FailEachCall(const std::function<void()>& make, const std::function<int()>& upgrade,
                      const std::function<void(int result, const std::string& failed)>& check,
                      int* calls = nullptr);

    TempDir dir_;
    TempDir cwd_;
    const std::string object_ = dir_ / "a.txt";
    const std::string ea_dir_ = dir_ / "@eaDir";
    const std::string stream_ = ea_dir_ + "/a.txt@MavoEAStream";
    const std::string resource_ = ea_dir_ + "/a.txt@MavoResource";
    const std::string folder_ = ea_dir_ + "/a.txt";
    const std::string legacy_resource_ = folder_ + "/MAVO:Resource";
    const std::string sidecar_ = dir_ / "._a.txt";
    const Values two_ = {{"color", Ascii("blue")}, {"tags", Ascii("work, home")}};
    int started_in_ = -1;
    int live_blocks_ = 0;
    long descriptors_ = 0;
};

// Upgrades again and again from what `make` makes, with one more call going well each time, until
// none fails. `check` gets the result and the name of the call that failed. Afterwards an upgrade
// in which nothing fails has to go well.
void EaUpgradeTest::FailEachCall(
    const std::function<void()>& make, const std::function<int()>& upgrade,
    const std::function<void(int result, const std::string& failed)>& check, int* calls) {
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        ASSERT_LT(nth, 300);
        StartAgain();
        make();
        TakeRecords();
        int result = 0;
        bool fired = false;
        std::string failed;
        {
            const FailNthCall fault(nth, EIO);
            result = upgrade();
            fired = fault.fired();
            failed = fault.name();
        }
        SCOPED_TRACE(failed);
        EXPECT_EQ(cwd_.path(), CurrentDirectory());
        EXPECT_EQ(descriptors_, OpenDescriptors());
        EXPECT_EQ(live_blocks_, TakeAllocations().live);
        if (result == -1) {
            EXPECT_THAT(TakeRecords(), Not(IsEmpty()));
        }
        check(result, failed);
        if (!fired) {
            if (calls != nullptr) *calls = nth - 1;
            return;
        }
        if (Exists(stream_)) {
            EXPECT_EQ(F_UNLCK, LockInTheWay(stream_, F_WRLCK));
        }
        EXPECT_THAT(upgrade(), AnyOf(0, 1, 2));
    }
}

// ---- Kinds and paths --------------------------------------------------------------------------

// Promise: "MAVOEAUpgrade: -1: 0xD00"
TEST_F(EaUpgradeTest, AKindThatIsNotReservedFailsWith0xD00AndTouchesNothing) {
    MakeFolder({{"other", Ascii("value")}, {"mavo:x", Ascii("x")}});
    TakeCallNames();
    for (const char* kind :
         {"other", "", "M", "MAV", "mavo:x", "Mavo", "mavoeastream", "MavoEAStrea", "MavoEAStreams",
          "MAvoResource", "Mavoresource", "MavoResource ", " MAVO", "xMAVO:x"}) {
        SCOPED_TRACE(kind);
        EXPECT_EQ(-1, MAVOEAUpgrade(object_.c_str(), kind));
        ExpectOnly(0xD00, kUnit);
    }
    EXPECT_EQ(-1, MAVOEAUpgrade(object_.c_str(), nullptr));
    ExpectOnly(0xD00, kUnit);
    EXPECT_EQ(-1, MAVOEAUpgrade(nullptr, "other"));
    ExpectOnly(0xD00, kUnit);
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
    EXPECT_THAT(NamesIn(folder_), ElementsAre("mavo:x", "other"));
}

// Promise: "MAVOEAUpgrade: what the path"
TEST_F(EaUpgradeTest, ErrorsOfThePathStandAsTheyWereRecorded) {
    const std::string endless = "/" + std::string(5000, 'a');
    TakeCallNames();
    for (const char* kind : {kStream, kResource, "MAVO:x"}) {
        SCOPED_TRACE(kind);
        EXPECT_EQ(-1, MAVOEAUpgrade(nullptr, kind));
        ExpectOnly(0xD00, "ea_path");
        EXPECT_EQ(-1, MAVOEAUpgrade("", kind));
        ExpectOnly(0xD00, "ea_path");
        EXPECT_EQ(-1, MAVOEAUpgrade(endless.c_str(), kind));
        ExpectOnly(0xC300, "ea_path");
    }
    EXPECT_THAT(TakeCallNames(), IsEmpty());
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// The current form needs the path, the kind and 9 bytes more; 4095 may be used.
TEST_F(EaUpgradeTest, ThePathOfTheStreamMayTake4095Bytes) {
    MakeFolder(two_);
    EXPECT_EQ(-1, MAVOEAUpgrade(LongPathToObject(4075).c_str(), kStream));
    ExpectOnly(0xC300, "ea_path");
    EXPECT_EQ(two_, InFolder());
    EXPECT_EQ(0, MAVOEAUpgrade(LongPathToObject(4074).c_str(), kStream));
    EXPECT_EQ(two_, InStream());
    ExpectNothingReported();
}

// ---- Streams: what there is and what comes of it ----------------------------------------------

// Promise: "MAVOEAUpgrade: 1 the current"
TEST_F(EaUpgradeTest, AnObjectWithAStreamIsLeftAsItIs) {
    MakeFolder(two_);
    MakeStream(Ascii("whatever"));
    MakeSidecar(SmallSidecar(), 1000);
    TakeCallNames();
    EXPECT_EQ(1, UpgradeStream());
    EXPECT_THAT(TakeCallNames(), ElementsAre("access"));
    EXPECT_EQ(Ascii("whatever"), ContentsOf(stream_));
    EXPECT_EQ(two_, InFolder());
    EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: 2 there is nothing"
TEST_F(EaUpgradeTest, AnObjectWithoutLegacyMetadataGives2AndNothingIsMadeOrRemoved) {
    TakeCallNames();
    EXPECT_EQ(2, UpgradeStream());
    EXPECT_THAT(TakeCallNames(), Not(Contains(AnyOf("mkdir", "rmdir", "rename", "unlink"))));
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("a.txt"));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: MAVOEA_KIND_STREAM"
// Promise: "MAVOEAUpgrade: A legacy folder that is empty"
// Promise: "MAVOEAUpgrade: 0 converted"
// Promise: "Where metadata lies: `D/@eaDir/N/`"
TEST_F(EaUpgradeTest, AttributeFilesMoveIntoANewStreamAndTheFolderGoes) {
    MakeFolder(two_);
    EXPECT_EQ(0, UpgradeStream());
    const auto stream = ReadMacFile(ContentsOf(stream_));
    ASSERT_TRUE(stream);
    EXPECT_EQ((MacContents{.attributes = two_}), *stream);
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt@MavoEAStream"));
    EXPECT_EQ(Ascii("data"), ContentsOf(object_));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();

    EXPECT_EQ(1, UpgradeStream());
    EXPECT_EQ(two_, InStream());
}

TEST_F(EaUpgradeTest, ASingleAttributeFileGivesExactlyTheStreamThatItsValueMakes) {
    MakeFolder({{"user.comment", Ascii("a value")}});
    EXPECT_EQ(0, UpgradeStream());
    StreamImage image;
    image.attributes = {{"user.comment", Ascii("a value")}};
    EXPECT_EQ(image.Build(), ContentsOf(stream_));
}

TEST_F(EaUpgradeTest, EmptyAndLargeAttributeFilesKeepTheirBytes) {
    const Values values = {{"empty", {}},
                           {"also empty", {}},
                           {"one", Ascii("1")},
                           {"large", Pattern(300000, 1)},
                           {"small after large", Pattern(10, 2)},
                           {"NULs", Repeat(0, 20)},
                           {"\xC3\xA9t\xC3\xA9 with spaces", Ascii("x")},
                           {".hidden", Ascii("h")},
                           {"..hidden", Ascii("hh")},
                           {"Mavo", Ascii("not reserved")},
                           {"MAV", Ascii("not reserved either")},
                           {"xMAVO", Ascii("nor this")}};
    MakeFolder(values);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(values, InStream());
    EXPECT_FALSE(Exists(folder_));
    ExpectNothingReported();
}

TEST_F(EaUpgradeTest, ReservedNamesAreNoAttributeFilesAndKeepTheFolder) {
    const Values reserved = {{"MAVO:Resource", Ascii("resource")},
                             {"a:b", Ascii("colon")},
                             {":", Ascii("only a colon")},
                             {"end:", Ascii("colon at the end")},
                             {"MAVO", Ascii("MAVO")},
                             {"MAVO@x", Ascii("moved")},
                             {"MAVOx", Ascii("x")}};
    MakeFolder(reserved, 5000);
    EXPECT_EQ(2, UpgradeStream());
    EXPECT_FALSE(Exists(stream_));
    EXPECT_EQ(reserved, InFolder());

    MakeFolder(two_);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(two_, InStream());
    EXPECT_EQ(reserved, InFolder());
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: A legacy folder that is empty"
TEST_F(EaUpgradeTest, AnEmptyFolderGives2AndIsRemoved) {
    MakeFolder({});
    EXPECT_EQ(2, UpgradeStream());
    EXPECT_FALSE(Exists(folder_));
    EXPECT_THAT(NamesIn(ea_dir_), IsEmpty());
    ExpectNothingReported();
}

TEST_F(EaUpgradeTest, TheUmaskNarrowsTheStream) {
    MakeFolder(two_);
    const Umask umask(027);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(0750, ModeOf(stream_));
}

TEST_F(EaUpgradeTest, DirectoriesAndMissingObjectsHaveAttributeFilesToo) {
    MakeFolder(two_);
    std::filesystem::remove(object_);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(two_, InStream());

    StartAgain();
    std::filesystem::remove(object_);
    std::filesystem::create_directory(object_);
    MakeFolder(two_);
    EXPECT_EQ(0, MAVOEAUpgrade((object_ + "/").c_str(), kStream));
    EXPECT_EQ(two_, InStream());
    EXPECT_FALSE(Exists(folder_));
    ExpectNothingReported();
}

// The folder has the name in full; the stream, one that fits.
TEST_F(EaUpgradeTest, TheStreamOfALongNameHasTheShortenedName) {
    const std::string name(250, 'a');  // 9 * 97 = 60 * 14 + 33, and character 33 is 'x'
    const std::string folder = ea_dir_ + "/" + name;
    std::filesystem::create_directories(folder);
    WriteFile(folder + "/color", Ascii("blue"));
    EXPECT_EQ(0, MAVOEAUpgrade((dir_ / name).c_str(), kStream));
    EXPECT_EQ((Values{{"color", Ascii("blue")}}),
              InStream(ea_dir_ + "/" + std::string(241, 'a') + "x@MavoEAStream"));
    EXPECT_FALSE(Exists(folder));
    ExpectNothingReported();
}

// A "._" file's name would take 256 or 257 bytes: there is none, but a folder there may be.
// Promise: "MAVOEAUpgrade: for the "._" file"
TEST_F(EaUpgradeTest, ANameThatIsTooLongForASidecarHasItsFolderConverted) {
    for (const auto& [size, shortened] : {std::pair{254, '2'}, std::pair{255, '='}}) {
        SCOPED_TRACE(size);
        StartAgain();
        const std::string name(static_cast<std::size_t>(size), 'a');
        const std::string object = dir_ / name;
        const std::string folder = ea_dir_ + "/" + name;
        const std::string stream =
            ea_dir_ + "/" + std::string(241, 'a') + shortened + "@MavoEAStream";
        EXPECT_EQ(0, MAVOEAUpgrade(object.c_str(), kStream));
        ExpectOnly(0xC300, "ea_adpath");
        EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("a.txt"));

        std::filesystem::create_directories(folder);
        EXPECT_EQ(0, MAVOEAUpgrade(object.c_str(), kStream));
        ExpectOnly(0xC300, "ea_adpath");
        EXPECT_THAT(NamesIn(ea_dir_), IsEmpty());

        std::filesystem::create_directories(folder);
        WriteFile(folder + "/color", Ascii("blue"));
        WriteFile(folder + "/tags", Ascii("work, home"));
        EXPECT_EQ(0, MAVOEAUpgrade(object.c_str(), kStream));
        ExpectOnly(0xC300, "ea_adpath");
        EXPECT_EQ(two_, InStream(stream));
        EXPECT_FALSE(Exists(folder));
        EXPECT_EQ(1, MAVOEAUpgrade(object.c_str(), kStream));
    }
}

TEST_F(EaUpgradeTest, AFolderOfAThousandAttributeFilesMovesWhole) {
    Values values;
    for (unsigned i = 0; i < 1000; ++i) {
        values["user.attribute." + std::to_string(i)] =
            Pattern(i % 97, static_cast<std::uint8_t>(i % 256));
    }
    MakeFolder(values);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(values, InStream());
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt@MavoEAStream"));
    ExpectNothingReported();
}

// ---- Streams: which of the two is newer -------------------------------------------------------

struct Times {
    const char* name;
    std::vector<time_t> attributes;  // of each attribute file
    std::optional<time_t> sidecar;
    int result;
    enum { kNone, kAttributes, kSidecar } winner;
};
void PrintTo(const Times& times, std::ostream* out) { *out << times.name; }

class EaUpgradeTimesTest : public EaUpgradeTest, public ::testing::WithParamInterface<Times> {};

INSTANTIATE_TEST_SUITE_P(
    Times, EaUpgradeTimesTest,
    ::testing::Values(
        Times{"OlderSidecar", {200}, 199, 0, Times::kAttributes},
        Times{"NewerSidecar", {200}, 201, 0, Times::kSidecar},
        Times{"EqualTimes", {200}, 200, 0, Times::kSidecar},
        Times{"TheLatestOfTheFilesIsNewer", {100, 300, 200}, 299, 0, Times::kAttributes},
        Times{"TheLatestOfTheFilesIsAsOld", {100, 300, 200}, 300, 0, Times::kSidecar},
        Times{"NoSidecar", {1}, {}, 0, Times::kAttributes},
        Times{"NoAttributeFiles", {}, 1, 0, Times::kSidecar},
        Times{"TheSidecarWasNeverRead", {1}, 0, 0, Times::kAttributes},
        Times{"TheFilesWereNeverRead", {0, 0}, 1, 0, Times::kSidecar},
        Times{"NeitherWasEverRead", {0, 0}, 0, 2, Times::kNone},
        Times{"OnlyFilesThatWereNeverRead", {0}, {}, 2, Times::kNone},
        Times{"OnlyASidecarThatWasNeverRead", {}, 0, 2, Times::kNone}),
    [](const auto& times) { return times.param.name; });

// Promise: "MAVOEAUpgrade: or a "._" file"
TEST_P(EaUpgradeTimesTest, TheOneThatWasReadLastBecomesTheStream) {
    const Times& times = GetParam();
    Values values;
    MakeFolder({});
    for (std::size_t i = 0; i < times.attributes.size(); ++i) {
        const std::string name = "attribute " + std::to_string(i);
        values[name] = Pattern(10 * i, 3);
        MakeFolder({{name, values[name]}}, times.attributes[i]);
        // What counts is when they were read, not when they were written.
        SetModification(folder_ + "/" + name, 100000);
    }
    if (times.sidecar) MakeSidecar(SmallSidecar(), *times.sidecar);

    EXPECT_EQ(times.result, UpgradeStream());
    ExpectNothingReported();
    switch (times.winner) {
        case Times::kNone:
            EXPECT_FALSE(Exists(stream_));
            EXPECT_EQ(values, InFolder());
            EXPECT_EQ(!values.empty(), Exists(folder_));
            break;
        case Times::kAttributes:
            EXPECT_EQ(values, InStream());
            EXPECT_FALSE(Exists(folder_));
            break;
        case Times::kSidecar:
            EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
            EXPECT_EQ(values, InFolder());
            EXPECT_EQ(!values.empty(), Exists(folder_));
            break;
    }
    EXPECT_EQ(times.sidecar && times.winner != Times::kSidecar, Exists(sidecar_));
}

TEST_F(EaUpgradeTest, TimesWithinOneSecondAreEqual) {
    MakeFolder(two_);
    SetAccess(folder_ + "/color", 200, 999999999);
    WriteFile(sidecar_, SmallSidecar());
    SetAccess(sidecar_, 200, 1);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
    EXPECT_EQ(two_, InFolder());
}

TEST_F(EaUpgradeTest, TheTimesOfReservedFilesDoNotCount) {
    MakeFolder(two_, 100);
    MakeFolder({{"MAVO:Resource", Ascii("r")}, {"a:b", Ascii("c")}}, 1000);
    MakeSidecar(SmallSidecar(), 500);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
    EXPECT_EQ(4u, InFolder().size());
}

TEST_F(EaUpgradeTest, TheTimeOfAnAttributeFileThatCannotBeStatedDoesNotCount) {
    MakeFolder({{"tags", Ascii("work")}}, 100);
    MakeFolder({{"color", Ascii("blue")}}, 1000);
    MakeSidecar(SmallSidecar(), 500);
    Hooks().stat = [](const char* path, struct stat* info) {
        if (std::string(path).ends_with("color")) return errno = EIO, -1;
        return ::stat(path, info);
    };
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
    EXPECT_EQ((Values{{"color", Ascii("blue")}, {"tags", Ascii("work")}}), InFolder());
    ExpectNothingReported();
}

// On most volumes the kernel takes note of a read that follows a change of the file.
TEST_F(EaUpgradeTest, TheUpgradesOwnLookIntoTheSidecarDoesNotMakeItNewer) {
    MakeFolder(two_, 1000);
    MakeSidecar(SmallSidecar(), 500);
    bool read = false;
    Hooks().before = [&](const std::string& name) {
        if (name != "pread" || read) return;
        read = true;
        SetAccess(sidecar_, 100000);
    };
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(two_, InStream());
    EXPECT_TRUE(Exists(sidecar_));
}

// ---- Streams: the "._" file -------------------------------------------------------------------

// Promise: "MAVOEAUpgrade: or a "._" file"
TEST_F(EaUpgradeTest, ANewerSidecarBecomesTheStreamAsItIsAndTheFolderIsKept) {
    MakeFolder(two_, 100);
    MakeSidecar(SmallSidecar(), 200);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
    EXPECT_FALSE(Exists(sidecar_));
    EXPECT_EQ(two_, InFolder());
    ExpectNothingReported();
}

TEST_F(EaUpgradeTest, TheEaDirectoryIsMadeForASidecar) {
    MakeSidecar(SmallSidecar(), 200);
    const Umask umask(077);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
    EXPECT_EQ(0777, ModeOf(ea_dir_));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt@MavoEAStream"));
    EXPECT_THAT(TakePlatformCalls(), Contains("MAVOACLSetEADirACL(" + ea_dir_ + ")"));
    ExpectNothingReported();
}

// Only its first four bytes are looked at.
TEST_F(EaUpgradeTest, ASidecarNeedsTheMagicAndItsObject) {
    MakeSidecar(Hex("00 05 16 07"), 200);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(Hex("00 05 16 07"), ContentsOf(stream_));

    StartAgain();
    MakeSidecar(Hex("00 05 16"), 200);
    EXPECT_EQ(2, UpgradeStream());
    MakeSidecar(Hex("00 05 16 00 00 02 00 00"), 200);  // AppleSingle
    EXPECT_EQ(2, UpgradeStream());
    EXPECT_TRUE(Exists(sidecar_));

    StartAgain();
    MakeSidecar(SmallSidecar(), 200);
    std::filesystem::remove(object_);
    EXPECT_EQ(2, UpgradeStream());
    EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));

    StartAgain();
    ASSERT_EQ(0, mkdir(sidecar_.c_str(), 0777));
    EXPECT_EQ(2, UpgradeStream());
    ASSERT_EQ(0, rmdir(sidecar_.c_str()));
    ASSERT_EQ(0, mkfifo(sidecar_.c_str(), 0666));
    EXPECT_EQ(2, UpgradeStream());
    EXPECT_TRUE(Exists(sidecar_));
    ExpectNothingReported();
    EXPECT_FALSE(Exists(ea_dir_));
}

TEST_F(EaUpgradeTest, ASidecarThatIsNotAcceptedDoesNotCountHoweverNew) {
    MakeFolder(two_, 100);
    MakeSidecar(Ascii("not AppleDouble"), 200);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(two_, InStream());
    EXPECT_EQ(Ascii("not AppleDouble"), ContentsOf(sidecar_));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: 0x2800"
TEST_F(EaUpgradeTest, ASidecarThatCannotBeRenamedFailsWith0x2800AndStays) {
    MakeFolder(two_, 100);
    MakeSidecar(SmallSidecar(), 200);
    const FailCall fault("rename", EXDEV);
    EXPECT_EQ(-1, UpgradeStream());
    ExpectOnly(0x2800, kUnit);
    EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));
    EXPECT_EQ(two_, InFolder());
    EXPECT_FALSE(Exists(stream_));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(EaUpgradeTest, ASidecarWhoseEaDirectoryCannotBeMadeStays) {
    MakeSidecar(SmallSidecar(), 200);
    const FailCall fault("mkdir", ENOSPC);
    EXPECT_EQ(-1, UpgradeStream());
    ExpectOnly(0x3C00, "ea_mkdir.c");
    EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));
}

class EaUpgradeMacFileTest : public EaUpgradeTest, public ::testing::WithParamInterface<MacFile> {
 protected:
    // Writes one more attribute into the stream; what MAVOEASWrite() returns.
    int AddAttribute(const std::string& name, const Bytes& value) const {
        const int fd = ::open(stream_.c_str(), O_RDWR);
        EXPECT_LE(0, fd);
        int result = -1;
        {
            const Handle handle(MAVOEASOpen(fd, F_WRLCK));
            EXPECT_NE(nullptr, handle);
            result = MAVOEASWrite(handle.get(), name.c_str(), value.data(),
                                  static_cast<unsigned>(value.size()), 0, 0);
        }
        ::close(fd);
        return result;
    }

    // Whether there is a fork that does not begin where the Finder info entry ends, as it does in
    // streams: such a file can be read, but no stream operation moves its fork.
    static bool HasForkElsewhere(const Bytes& bytes) {
        std::uint32_t finder_end = 0;
        std::uint32_t fork_at = 0;
        std::uint32_t fork_length = 0;
        for (unsigned i = 0; i < U16At(bytes, 24); ++i) {
            const std::size_t at = 26 + 12 * i;
            if (U32At(bytes, at) == 9) finder_end = U32At(bytes, at + 4) + U32At(bytes, at + 8);
            if (U32At(bytes, at) == 2) {
                fork_at = U32At(bytes, at + 4);
                fork_length = U32At(bytes, at + 8);
            }
        }
        return fork_length > 0 && fork_at != finder_end;
    }
};

INSTANTIATE_TEST_SUITE_P(MacFiles, EaUpgradeMacFileTest, ::testing::ValuesIn(AllMacFiles()),
                         [](const auto& file) { return std::to_string(file.index); });

TEST_P(EaUpgradeMacFileTest, EverythingInTheSidecarIsKeptThroughUpgradeAndRewrite) {
    MakeSidecar(GetParam().bytes, 200);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(GetParam().bytes, ContentsOf(stream_));
    ExpectNothingReported();

    if (HasForkElsewhere(GetParam().bytes)) {
        EXPECT_EQ(-1, AddAttribute("user.one more", Ascii("one more")));
        ExpectOnly(0xA00, "eas_write");
        EXPECT_EQ(GetParam().bytes, ContentsOf(stream_));
        return;
    }
    EXPECT_EQ(8, AddAttribute("user.one more", Ascii("one more")));
    MacContents expected = GetParam().contents;
    expected.attributes["user.one more"] = Ascii("one more");
    const auto found = ReadMacFile(ContentsOf(stream_));
    ASSERT_TRUE(found);
    EXPECT_EQ(expected.attributes, found->attributes);
    EXPECT_EQ(expected.finder_info, found->finder_info);
    EXPECT_EQ(expected.fork, found->fork);
    ExpectNothingReported();
}

TEST_P(EaUpgradeMacFileTest, TheLibraryReadsEveryAttributeOfTheUpgradedStream) {
    MakeSidecar(GetParam().bytes, 200);
    const int fd = MAVOEAOpen(EA_FORM_FILE, object_.c_str(), kStream, O_RDONLY, EA_PLACE_EADIR);
    ASSERT_LE(0, fd);
    {
        const Handle handle(MAVOEASOpen(fd, F_RDLCK));
        ASSERT_NE(nullptr, handle);
        EXPECT_EQ(GetParam().contents.attributes.size(), U16At(handle->header, kAttributeCountAt));
        for (const auto& [name, value] : GetParam().contents.attributes) {
            SCOPED_TRACE(name);
            Bytes read(value.size() + 1);
            EXPECT_EQ(static_cast<int>(value.size()),
                      MAVOEASRead(handle.get(), name.c_str(), read.data(),
                                  static_cast<unsigned>(read.size()), 0));
            read.pop_back();
            EXPECT_EQ(value, read);
        }
    }
    ::close(fd);
    ExpectNothingReported();
}

// ---- Streams: attribute files that cannot be converted ----------------------------------------

class EaUpgradeBadFileTest : public EaUpgradeTest {
 protected:
    // The two good files are in the stream, the bad one is where it was, and its code was recorded.
    void ExpectOnlyThisOneSkipped(const std::string& name, int code) const {
        ExpectSkipped(name, code);
        EXPECT_EQ(two_, InStream());
        EXPECT_THAT(NamesIn(folder_), ElementsAre(name));
    }
    // That it could not be read was recorded and logged.
    void ExpectSkipped(const std::string& name, int code) const {
        const auto records = TakeRecords();
        ASSERT_THAT(records, ElementsAre(RecordOf(code, kUnit)));
        char text[16];
        snprintf(text, sizeof text, "0x%04X ", static_cast<unsigned>(code));
        EXPECT_THAT(TakeLog(), ElementsAre("ea_upgrade:LINE cannot read[" + object_ + "][" + name +
                                           "] MavoErr=[" + text +
                                           "ea_upgrade:" + std::to_string(records[0].line) + "]"));
    }
    const std::string bad_ = folder_ + "/bad";
};

// Promise: "MAVOEAUpgrade: Attribute files that cannot be read"
// Promise: "MAVOEAUpgrade: Codes are recorded"
TEST_F(EaUpgradeBadFileTest, OneThatCannotBeStated) {
    MakeFolder(two_);
    ASSERT_EQ(0, symlink("nowhere", bad_.c_str()));
    EXPECT_EQ(0, UpgradeStream());
    ExpectOnlyThisOneSkipped("bad", 0x2A00);
}

TEST_F(EaUpgradeBadFileTest, OneThatCannotBeStatedWhicheverItIs) {
    Values three = two_;
    three["third"] = Ascii("3");
    for (const auto& [name, value] : three) {
        SCOPED_TRACE(name);
        StartAgain();
        MakeFolder(three);
        const std::string look = "stat(" + folder_ + "/" + name + ")";
        int looks = 0;  // the second is the one before it is read
        Hooks().fails = [&](const std::string& call) {
            return call == look && ++looks == 2 ? EACCES : 0;
        };
        EXPECT_EQ(0, UpgradeStream());
        Hooks().fails = nullptr;
        ASSERT_EQ(2, looks);
        ExpectSkipped(name, 0x2A00);
        EXPECT_EQ((Values{{name, value}}), InFolder());
        Values rest = three;
        rest.erase(name);
        EXPECT_EQ(rest, InStream());
    }
}

// Promise: "MAVOEAUpgrade: Codes are recorded"
TEST_F(EaUpgradeBadFileTest, OneThatCannotBeOpenedWhicheverItIs) {
    Values three = two_;
    three["third"] = Ascii("3");
    const auto make = [&] { MakeFolder(three); };
    for (const auto& [name, value] : three) {
        SCOPED_TRACE(name);
        const std::string path = folder_ + "/" + name;
        const int nth = WhichCall("open", path, make);
        {
            const FailCall fault("open", EACCES, nth);
            EXPECT_EQ(0, UpgradeStream());
            ASSERT_TRUE(fault.fired());
        }
        ExpectSkipped(name, 0x900);
        EXPECT_EQ((Values{{name, value}}), InFolder());
        Values rest = three;
        rest.erase(name);
        EXPECT_EQ(rest, InStream());
    }
}

TEST_F(EaUpgradeBadFileTest, ASocket) {
    MakeFolder(two_);
    ASSERT_EQ(0, mknod(bad_.c_str(), S_IFSOCK | 0666, 0)) << strerror(errno);
    EXPECT_EQ(0, UpgradeStream());
    ExpectOnlyThisOneSkipped("bad", 0x900);
}

// Promise: "MAVOEAUpgrade: Attribute files that cannot be read"
// Promise: "MAVOEAUpgrade: the others are converted"
TEST_F(EaUpgradeBadFileTest, OneThatTheUserMayNotRead) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MakeFolder(two_);
    WriteFile(bad_, Ascii("secret"));
    ASSERT_EQ(0, chmod(bad_.c_str(), 0600));
    AsUser(kUser, Root::kGivenUp, [this] {
        EXPECT_EQ(0, UpgradeStream());
        ExpectOnlyThisOneSkipped("bad", 0x900);
    });
    EXPECT_EQ(Ascii("secret"), ContentsOf(bad_));
}

// Standard input is not to be taken for a file.
TEST_F(EaUpgradeBadFileTest, OneThatIsOpenedAsDescriptor0) {
    const auto make = [this] { MakeFolder({{"bad", Ascii("value")}}); };
    const int nth = WhichCall("open", bad_, make);
    int opens = 0;
    std::optional<FreedDescriptor> standard_input;
    Hooks().before = [&](const std::string& name) {
        if (name == "open" && ++opens == nth) standard_input.emplace(0);
    };
    const int result = UpgradeStream();
    Hooks().before = nullptr;
    standard_input.reset();
    EXPECT_LE(nth, opens);
    EXPECT_EQ(0, result);
    ExpectSkipped("bad", 0x900);
    EXPECT_EQ((Values{{"bad", Ascii("value")}}), InFolder());
    EXPECT_EQ((Values{}), InStream());
}

TEST_F(EaUpgradeBadFileTest, OneThatIsShorterThanItsSize) {
    MakeFolder(two_);
    MakeFolder({{"bad", Ascii("short")}});
    Hooks().stat = [this](const char* path, struct stat* info) {
        const int result = ::stat(path, info);
        if (path == bad_) info->st_size = 6;
        return result;
    };
    EXPECT_EQ(0, UpgradeStream());
    ExpectOnlyThisOneSkipped("bad", 0xA00);
    EXPECT_EQ(Ascii("short"), ContentsOf(bad_));
}

// Promise: "MAVOEAUpgrade: Codes are recorded"
TEST_F(EaUpgradeBadFileTest, OneThatCannotBeRead) {
    MakeFolder(two_);
    MakeFolder({{"bad", Pattern(777)}});
    const int nth = WhichCall("pread", "777, 0", [this] {
        MakeFolder(two_);
        MakeFolder({{"bad", Pattern(777)}});
    });
    const FailCall fault("pread", EIO, nth);
    EXPECT_EQ(0, UpgradeStream());
    ExpectOnlyThisOneSkipped("bad", 0xA00);
    EXPECT_EQ(Pattern(777), ContentsOf(bad_));
}

// The kernel need not give all at once.
TEST_F(EaUpgradeBadFileTest, OneThatIsReadInPiecesIsReadWhole) {
    const auto make = [this] { MakeFolder({{"pieces", Pattern(777)}}); };
    const int nth = WhichCall("pread", "777, 0", make);
    const ShortCall shortened("pread", nth, 10, true);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_TRUE(shortened.fired());
    EXPECT_EQ((Values{{"pieces", Pattern(777)}}), InStream());
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: Codes are recorded"
TEST_F(EaUpgradeBadFileTest, OneForWhichThereIsNoMemory) {
    constexpr std::size_t kSize = 1000000;
    const Values values = {{"large", Pattern(kSize)}, {"small", Ascii("s")}};
    int skipped = 0;
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        StartAgain();
        MakeFolder(values);
        const FailCall fault("malloc", ENOMEM, nth);
        const int result = UpgradeStream();
        if (!fault.fired()) break;
        const auto records = TakeRecords();
        ASSERT_FALSE(records.empty());
        ExpectNothingLost(values);
        if (records[0].code != 0x100) continue;
        // The buffer for a value: one file is skipped and stays.
        ++skipped;
        EXPECT_EQ(0, result);
        EXPECT_THAT(records, ElementsAre(RecordOf(0x100, kUnit)));
        EXPECT_EQ(1u, InFolder().size());
        EXPECT_EQ(1u, InStream().size());
    }
    EXPECT_LE(1, skipped);
    EXPECT_EQ(values, InStream());
}

// No stream has room for it, whatever memory there is.
TEST_F(EaUpgradeBadFileTest, OneOfTwoGigabytesStays) {
    MakeFolder(two_);
    MakeFolder({{"bad", {}}});
    ASSERT_EQ(0, truncate(bad_.c_str(), off_t{1} << 31)) << strerror(errno);
    EXPECT_EQ(0, UpgradeStream());
    ExpectOnlyThisOneSkipped("bad", 0x100);
}

TEST_F(EaUpgradeBadFileTest, OfTheSizeOnlyTheLow32BitsCount) {
    MakeFolder({{"five", Ascii("five and more")}});
    Hooks().stat = [](const char* path, struct stat* info) {
        const int result = ::stat(path, info);
        info->st_size = (off_t{1} << 32) + 5;
        return result;
    };
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ((Values{{"five", Ascii("five ")}}), InStream());
    EXPECT_FALSE(Exists(folder_));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: Attribute files that cannot be read"
TEST_F(EaUpgradeBadFileTest, OneWhoseNameIsTooLongForAnAttribute) {
    const std::string longest(254, 'n');
    const std::string too_long(255, 'n');
    Values good = two_;
    good[longest] = Ascii("fits");
    MakeFolder(good);
    MakeFolder({{too_long, Ascii("does not")}});
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(good, InStream());
    EXPECT_EQ((Values{{too_long, Ascii("does not")}}), InFolder());
    const auto records = TakeRecords();
    ASSERT_THAT(records, ElementsAre(RecordOf(0xD00, "eas_write")));
    EXPECT_THAT(TakeLog(), ElementsAre("ea_upgrade:LINE MAVOEASWrite error, "
                                       "MavoErr=[0x0D00 eas_write:" +
                                       std::to_string(records[0].line) + "]"));
}

// It can be read: what lacks it is no upgraded stream.
TEST_F(EaUpgradeBadFileTest, OneThatCannotBeWrittenFailsTheUpgradeWhichChangesNothing) {
    MakeFolder(two_);
    Hooks().fsync = [](int) { return errno = ENOSPC, -1; };
    errno = 0;
    EXPECT_EQ(-1, UpgradeStream());
    EXPECT_EQ(ENOSPC, errno);
    const auto records = TakeRecords();
    ASSERT_THAT(records, ElementsAre(RecordOf(0x2A00, "eas_flush")));
    EXPECT_THAT(TakeLog(),
                ElementsAre("ea_upgrade:LINE MAVOEASWrite error, MavoErr=[0x2A00 eas_flush:" +
                            std::to_string(records[0].line) + "]"));
    EXPECT_EQ(two_, InFolder());
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt"));
}

// The legacy form needs the object's path, the name and 8 bytes more.
TEST_F(EaUpgradeBadFileTest, OneWhosePathIsTooLongIsLogged) {
    const std::string object = LongPathToObject(4074);
    Values good = {{std::string(13, 'g'), Ascii("fits")}, {"short", Ascii("too")}};
    const std::string bad(14, 'b');
    MakeFolder(good);
    MakeFolder({{bad, Ascii("does not")}});
    EXPECT_EQ(0, MAVOEAUpgrade(object.c_str(), kStream));
    EXPECT_EQ(good, InStream());
    EXPECT_EQ((Values{{bad, Ascii("does not")}}), InFolder());
    const auto records = TakeRecords();
    ASSERT_THAT(records, ElementsAre(RecordOf(0xC300, "ea_path")));
    EXPECT_THAT(TakeLog(),
                ElementsAre("ea_upgrade:LINE cannot EAPath[" + object + "][" + bad +
                            "] MavoErr=[0xC300 ea_path:" + std::to_string(records[0].line) + "]"));
}

TEST_F(EaUpgradeBadFileTest, ASubdirectory) {
    MakeFolder(two_);
    std::filesystem::create_directory(bad_);
    WriteFile(bad_ + "/inside", Ascii("inside"));
    // Some filesystems give directories no size.
    Hooks().stat = [this](const char* path, struct stat* info) {
        const int result = ::stat(path, info);
        if (path == bad_) info->st_size = 4096;
        return result;
    };
    EXPECT_EQ(0, UpgradeStream());
    ExpectOnlyThisOneSkipped("bad", 0xA00);
    EXPECT_EQ(Ascii("inside"), ContentsOf(bad_ + "/inside"));
}

TEST_F(EaUpgradeBadFileTest, ANamedPipeDoesNotKeepTheUpgradeWaiting) {
    MakeFolder(two_);
    ASSERT_EQ(0, mkfifo(bad_.c_str(), 0666));
    EXPECT_EQ(0, UpgradeStream());
    ExpectOnlyThisOneSkipped("bad", 0x900);
}

TEST_F(EaUpgradeBadFileTest, OneThatCannotBeUnlinkedIsInBothPlaces) {
    MakeFolder(two_);
    const FailCall fault("unlink", EPERM, 0);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(two_, InStream());
    EXPECT_EQ(two_, InFolder());
    ExpectNothingReported();
}

TEST_F(EaUpgradeBadFileTest, WhatIsLeftIsTriedAgainOnlyWhenTheStreamIsMissing) {
    MakeFolder(two_);
    ASSERT_EQ(0, symlink("later", bad_.c_str()));
    EXPECT_EQ(0, UpgradeStream());
    WriteFile(folder_ + "/later", Ascii("now"));
    EXPECT_EQ(1, UpgradeStream());
    EXPECT_THAT(NamesIn(folder_), ElementsAre("bad", "later"));
    std::filesystem::remove(stream_);
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(Ascii("now"), InStream().at("later"));
}

// ---- Streams: how the new one comes -------------------------------------------------------------

class EaUpgradeNewStreamTest : public EaUpgradeTest {
 protected:
    void SetUp() override {
        EaUpgradeTest::SetUp();
        values_["empty"] = {};
        values_["large"] = Pattern(20000);
    }

    // How files without a name are not to be had.
    enum class Lack { kNone, kNameless, kProc, kNamelessAndLinks };
    static constexpr Lack kLacks[] = {Lack::kNone, Lack::kNameless, Lack::kProc,
                                      Lack::kNamelessAndLinks};
    static void Without(Lack lack) {
        SCOPED_TRACE(static_cast<int>(lack));
        Hooks().fails = [lack](const std::string& call) {
            const bool nameless = call.find("O_TMPFILE") != std::string::npos;
            if (call.starts_with("access(/proc/")) return lack == Lack::kProc ? ENOENT : 0;
            if (nameless && lack != Lack::kNone) return EOPNOTSUPP;
            return call.starts_with("link(") && lack == Lack::kNamelessAndLinks ? EPERM : 0;
        };
    }

    // What the EA directory holds before the upgrade: nothing but the folder.
    void ExpectNothingMade() const {
        EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt"));
        EXPECT_EQ(values_, InFolder());
    }

    Values values_ = two_;
};

// Promise: "MAVOEAUpgrade: The stream gets its name"
TEST_F(EaUpgradeNewStreamTest, FromTheMomentItHasANameItHasAllValuesAndTheyAreOnDisk) {
    for (const Lack lack : kLacks) {
        SCOPED_TRACE(static_cast<int>(lack));
        StartAgain();
        MakeFolder(values_);
        Without(lack);
        bool synced = true;
        int looks = 0;
        Hooks().changed = [&](const FileChange& change) {
            if (change.kind == FileChange::kWritten) synced = false;
            if (change.kind == FileChange::kSynced) synced = true;
        };
        Hooks().before = [&](const std::string&) {
            if (!Exists(stream_)) return;
            ++looks;
            EXPECT_TRUE(synced);
            EXPECT_EQ(values_, InStream());
        };
        EXPECT_EQ(0, UpgradeStream());
        Hooks().before = nullptr;
        Hooks().changed = nullptr;
        EXPECT_LT(4, looks);  // the removal of the files and of the folder comes after it
        EXPECT_EQ(values_, InStream());
        EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt@MavoEAStream"));
        ExpectNothingReported();
    }
}

TEST_F(EaUpgradeNewStreamTest, IsOpenToOthersAsSoonAsItHasAName) {
    MakeFolder(values_);
    int looks = 0;
    Hooks().before = [&](const std::string& name) {
        if (name != "unlink" || !Exists(stream_)) return;
        ++looks;
        EXPECT_EQ(F_UNLCK, LockInTheWay(stream_, F_WRLCK));
    };
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(4, looks);
}

TEST_F(EaUpgradeNewStreamTest, TheUmaskNarrowsItHoweverItComes) {
    for (const Lack lack : kLacks) {
        SCOPED_TRACE(static_cast<int>(lack));
        StartAgain();
        MakeFolder(values_);
        Without(lack);
        const Umask umask(027);
        EXPECT_EQ(0, UpgradeStream());
        EXPECT_EQ(0750, ModeOf(stream_));
    }
}

// Promise: "MAVOEAUpgrade: The stream gets its name"
TEST_F(EaUpgradeNewStreamTest, WhateverFailsThereIsNoStreamThatLacksWhatCouldBeRead) {
    for (const Lack lack : kLacks) {
        SCOPED_TRACE(static_cast<int>(lack));
        FailEachCall(
            [&] {
                Hooks().fails = nullptr;
                MakeFolder(values_);
                Without(lack);
            },
            [this] { return UpgradeStream(); },
            [&](int result, const std::string& failed) {
                ExpectNothingLost(values_);
                for (const std::string& name : NamesIn(ea_dir_)) {
                    EXPECT_TRUE(failed == "unlink" || !name.starts_with(".")) << name;
                }
                if (result == -1 && failed != "rmdir") {
                    ExpectNothingMade();
                } else {
                    // At most one file could not be read, and stays.
                    EXPECT_LE(values_.size() - 1, InStream().size());
                }
            });
    }
}

// Promise: "MAVOEAUpgrade: 0x900 the stream"
// Promise: "MAVOEAUpgrade: errno is that"
TEST_F(EaUpgradeNewStreamTest, ThatCannotBeMadeFailsWith0x900) {
    for (const char* const call : {"open(", "link("}) {
        SCOPED_TRACE(call);
        StartAgain();
        MakeFolder(values_);
        Hooks().fails = [call](const std::string& made) {
            const bool creates = made.find("O_TMPFILE") != std::string::npos ||
                                 made.find("O_CREAT") != std::string::npos ||
                                 made.starts_with("link(");
            return made.starts_with(call) && creates ? EDQUOT : 0;
        };
        errno = 0;
        EXPECT_EQ(-1, UpgradeStream());
        EXPECT_EQ(EDQUOT, errno);
        ExpectOnly(0x900, kUnit);
        EXPECT_THAT(TakeLog(), IsEmpty());
        Hooks().fails = nullptr;
        ExpectNothingMade();
    }
}

// Promise: "MAVOEAUpgrade: what the path"
TEST_F(EaUpgradeNewStreamTest, ThatCannotBeLockedFailsWithItsCode) {
    MakeFolder(values_);
    const FailCall fault("setlock", EAGAIN);
    EXPECT_EQ(-1, UpgradeStream());
    EXPECT_EQ((std::vector<int>{0x400}), TakeCodes());
    ExpectNothingMade();
}

TEST_F(EaUpgradeNewStreamTest, DoesNotReplaceOneThatIsMadeMeanwhile) {
    for (const Lack lack : kLacks) {
        SCOPED_TRACE(static_cast<int>(lack));
        StartAgain();
        MakeFolder(values_);
        Without(lack);
        Hooks().before = [&](const std::string& name) {
            if (name == "link") MakeStream(Ascii("another's"));
        };
        EXPECT_EQ(1, UpgradeStream());
        Hooks().before = nullptr;
        EXPECT_EQ(Ascii("another's"), ContentsOf(stream_));
        EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt", "a.txt@MavoEAStream"));
        EXPECT_EQ(values_, InFolder());
        ExpectNothingReported();
    }
}

// Another process converts what this one has just found.
TEST_F(EaUpgradeTest, WhatAnotherProcessConvertsMeanwhileIsCurrent) {
    const auto at_the_first = [](const std::string& call, const std::function<void()>& convert) {
        Hooks().before = [=](const std::string& name) {
            if (name != call) return;
            const auto once = convert;  // this goes with the hook
            Hooks().before = nullptr;
            once();
        };
    };
    MakeFolder(two_);
    at_the_first("readdir", [this] {
        MakeStream(Ascii("stream"));
        for (const auto& [name, value] : two_) std::filesystem::remove(folder_ + "/" + name);
    });
    EXPECT_EQ(1, UpgradeStream());

    StartAgain();
    MakeSidecar(SmallSidecar(), 200);
    at_the_first("rename", [this] { std::filesystem::rename(sidecar_, stream_); });
    EXPECT_EQ(1, UpgradeStream());
    EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));

    StartAgain();
    MakeFolder({{"MAVO:Resource", Ascii("resource")}});
    at_the_first("rename", [this] { std::filesystem::rename(legacy_resource_, resource_); });
    EXPECT_EQ(1, MAVOEAUpgrade(object_.c_str(), kResource));
    EXPECT_EQ(Ascii("resource"), ContentsOf(resource_));
    ExpectNothingReported();
}

TEST_F(EaUpgradeNewStreamTest, IsMadeBesideWhatAnEarlierProcessOfItsNumberLeft) {
    MakeFolder(values_);
    Without(Lack::kNameless);
    char name[32];
    snprintf(name, sizeof name, "/.mavoea-%08x", static_cast<unsigned>(getpid()) * 64);
    WriteFile(ea_dir_ + name, Ascii("left"));
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(values_, InStream());
    EXPECT_EQ(Ascii("left"), ContentsOf(ea_dir_ + name));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre(name + 1, "a.txt@MavoEAStream"));
}

// ---- Streams: the folder ----------------------------------------------------------------------

// Promise: "MAVOEAUpgrade: 0x3900"
TEST_F(EaUpgradeTest, AFolderThatCannotBeRemovedFailsWith0x3900) {
    MakeFolder(two_);
    {
        const FailCall fault("rmdir", EBUSY);
        EXPECT_EQ(-1, UpgradeStream());
    }
    ExpectOnly(0x3900, kUnit);
    EXPECT_EQ(two_, InStream());

    StartAgain();
    MakeFolder({});
    MakeSidecar(SmallSidecar(), 200);
    {
        const FailCall fault("rmdir", EPERM);
        EXPECT_EQ(-1, UpgradeStream());
    }
    ExpectOnly(0x3900, kUnit);
    EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));

    StartAgain();
    MakeFolder({});
    {
        const FailCall fault("rmdir", EACCES);
        EXPECT_EQ(-1, UpgradeStream());
    }
    ExpectOnly(0x3900, kUnit);
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(EaUpgradeTest, AFolderThatHasGoneOrIsNotEmptyIsNoFailure) {
    for (const int error : {ENOENT, ENOTEMPTY}) {
        SCOPED_TRACE(strerror(error));
        StartAgain();
        MakeFolder(two_);
        const FailCall fault("rmdir", error);
        EXPECT_EQ(0, UpgradeStream());
        EXPECT_TRUE(fault.fired());
        EXPECT_EQ(two_, InStream());
        ExpectNothingReported();
    }
}

TEST_F(EaUpgradeTest, TheFolderIsRemovedAfterAFailureToo) {
    MakeFolder({});
    MakeSidecar(SmallSidecar(), 200);
    const FailCall fault("rename", EIO);
    EXPECT_EQ(-1, UpgradeStream());
    ExpectOnly(0x2800, kUnit);
    EXPECT_FALSE(Exists(folder_));
}

TEST_F(EaUpgradeTest, AFailureOfTheConversionStandsWhateverBecomesOfTheFolder) {
    MakeFolder({});
    MakeSidecar(SmallSidecar(), 200);
    Hooks().fails = [](const std::string& call) {
        return call.starts_with("rename(") ? EIO : call.starts_with("rmdir(") ? EBUSY : 0;
    };
    errno = 0;
    EXPECT_EQ(-1, UpgradeStream());
    EXPECT_EQ(EIO, errno);
    ExpectOnly(0x2800, kUnit);
}

TEST_F(EaUpgradeTest, WhatIsNoFolderCannotBeRemoved) {
    std::filesystem::create_directory(ea_dir_);
    WriteFile(folder_, Ascii("a file in place of the folder"));
    EXPECT_EQ(-1, UpgradeStream());
    ExpectOnly(0x3900, kUnit);
    EXPECT_EQ(Ascii("a file in place of the folder"), ContentsOf(folder_));

    StartAgain();
    MakeFolder(two_);
    std::filesystem::rename(folder_, dir_ / "elsewhere");
    ASSERT_EQ(0, symlink("../elsewhere", folder_.c_str()));
    EXPECT_EQ(-1, UpgradeStream());
    ExpectOnly(0x3900, kUnit);
    EXPECT_THAT(NamesIn(dir_ / "elsewhere"), ElementsAre("color", "tags"));
    EXPECT_FALSE(Exists(stream_));
}

// ---- Streams: what cannot be looked at ----------------------------------------------------------

class EaUpgradeUnseenTest : public EaUpgradeTest {
 protected:
    void MakeBoth() const {
        StartAgain();
        MakeFolder(two_, 1000);
        MakeSidecar(SmallSidecar(), 200);
    }

    // The upgrade of that kind fails, with errno and this code, and changes nothing.
    void ExpectFailure(const char* kind, int code, int error) const {
        const auto before = Tree(dir_.path());
        errno = 0;
        EXPECT_EQ(-1, MAVOEAUpgrade(object_.c_str(), kind));
        EXPECT_EQ(error, errno) << strerror(errno);
        ExpectOnly(code, kUnit);
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_EQ(before, Tree(dir_.path()));
    }
};

TEST_F(EaUpgradeUnseenTest, AFolderThatCannotBeOpenedMayHoldAnything) {
    for (const int error : {EACCES, EIO, EMFILE, ENFILE, ENOMEM, ELOOP}) {
        SCOPED_TRACE(strerror(error));
        MakeBoth();
        const FailCall fault("opendir", error);
        ExpectFailure(kStream, 0x900, error);
    }
    for (const int error : {ENOENT, ENOTDIR}) {
        SCOPED_TRACE(strerror(error));
        StartAgain();
        const FailCall fault("opendir", error);
        EXPECT_EQ(2, UpgradeStream());
        EXPECT_TRUE(fault.fired());
        ExpectNothingReported();
    }
}

TEST_F(EaUpgradeUnseenTest, AFolderThatTheUserMayNotReadMayHoldAnything) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MakeBoth();
    ASSERT_EQ(0, chmod(folder_.c_str(), 0300));
    AsUser(kUser, Root::kGivenUp, [this] {
        EXPECT_EQ(-1, UpgradeStream());
        ExpectOnly(0x900, kUnit);
    });
    ASSERT_EQ(0, chmod(folder_.c_str(), 0777));
    EXPECT_EQ(two_, InFolder());
    EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));
    EXPECT_FALSE(Exists(stream_));
}

// Neither walk decides anything by what it saw of a folder that cannot be read to its end.
// Promise: "MAVOEAUpgrade: 0xA00 the folder"
TEST_F(EaUpgradeUnseenTest, AFolderThatCannotBeReadToItsEndMayHoldMore) {
    int reads = 0;
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        ASSERT_LT(nth, 20);
        MakeBoth();
        const FailCall fault("readdir", EIO, nth);
        errno = 0;
        const int result = UpgradeStream();
        const int error = errno;
        if (!fault.fired()) {
            EXPECT_EQ(0, result);
            reads = nth - 1;
            break;
        }
        EXPECT_EQ(-1, result);
        EXPECT_EQ(EIO, error);
        ExpectOnly(0xA00, kUnit);
        ExpectNothingLost(two_);
        EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));
    }
    EXPECT_EQ(10, reads);  // ".", "..", two files and the end, twice
}

TEST_F(EaUpgradeUnseenTest, AFileThatCannotBeLookedAtMayBeThere) {
    for (const auto& [kind, path] :
         {std::pair{kStream, stream_}, std::pair{kResource, resource_},
          std::pair{kResource, legacy_resource_}, std::pair{"MAVO:x", folder_ + "/MAVO@x"},
          std::pair{"MAVO:x", folder_ + "/MAVO:x"}}) {
        for (const int error : {EACCES, EIO, ENOMEM, ELOOP}) {
            SCOPED_TRACE(path + ": " + strerror(error));
            MakeBoth();
            MakeFolder({{"MAVO:Resource", Ascii("r")}, {"MAVO:x", Ascii("x")}});
            Hooks().fails = [&path = path, error](const std::string& call) {
                return call.starts_with("access(" + path + ", ") ? error : 0;
            };
            ExpectFailure(kind, 0x900, error);
            Hooks().fails = nullptr;
        }
    }
}

// Promise: "MAVOEAUpgrade: 0x2A00 none"
TEST_F(EaUpgradeUnseenTest, AttributeFilesOfWhichNoneCanBeLookedAtMayBeThere) {
    for (const int error : {EACCES, EIO, ENOMEM, ELOOP}) {
        SCOPED_TRACE(strerror(error));
        MakeBoth();
        Hooks().stat = [error](const char*, struct stat*) { return errno = error, -1; };
        ExpectFailure(kStream, 0x2A00, error);
        Hooks().stat = nullptr;
    }
}

TEST_F(EaUpgradeUnseenTest, ASidecarThatCannotBeLookedAtMayBeThere) {
    for (const bool folder : {true, false}) {
        SCOPED_TRACE(folder);
        StartAgain();
        if (folder) MakeFolder(two_, 1000);
        MakeSidecar(SmallSidecar(), 200);
        Hooks().lstat = [](const char*, struct stat*) { return errno = EIO, -1; };
        ExpectFailure(kStream, 0x900, EIO);
        Hooks().lstat = nullptr;
    }
}

// ---- Streams: the current directory -----------------------------------------------------------

// Promise: "MAVOEAUpgrade: The process's working directory"
TEST_F(EaUpgradeTest, ObjectPathsMayBeRelative) {
    for (const bool sidecar : {false, true}) {
        SCOPED_TRACE(sidecar);
        for (const char* path : {"a.txt", "./a.txt", "../here/a.txt", "sub/../a.txt", "a.txt/"}) {
            SCOPED_TRACE(path);
            const TempDir parent;
            const std::string here = parent / "here";
            std::filesystem::create_directories(here + "/@eaDir/a.txt");
            std::filesystem::create_directories(here + "/sub");
            WriteFile(here + "/a.txt", Ascii("data"));
            if (sidecar) {
                WriteFile(here + "/._a.txt", SmallSidecar());
            } else {
                WriteFile(here + "/@eaDir/a.txt/color", Ascii("blue"));
            }
            ASSERT_EQ(0, chdir(here.c_str()));
            EXPECT_EQ(0, MAVOEAUpgrade(path, kStream));
            EXPECT_EQ(here, CurrentDirectory());
            EXPECT_THAT(NamesIn(here + "/@eaDir"), ElementsAre("a.txt@MavoEAStream"));
            const Values expected = {sidecar ? std::pair{"from a Mac", Ascii("yes")}
                                             : std::pair{"color", Ascii("blue")}};
            EXPECT_EQ(expected, InStream(here + "/@eaDir/a.txt@MavoEAStream"));
            ASSERT_EQ(0, chdir(cwd_.path().c_str()));
        }
    }
    ExpectNothingReported();
}

TEST_F(EaUpgradeTest, AProcessInADirectoryThatWasRemovedStaysInIt) {
    MakeFolder(two_);
    const std::string removed = dir_ / "removed";
    std::filesystem::create_directory(removed);
    ASSERT_EQ(0, chdir(removed.c_str()));
    std::filesystem::remove(removed);
    const auto before = CurrentInode();
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(before, CurrentInode());
    EXPECT_EQ(two_, InStream());
    ASSERT_EQ(0, chdir(cwd_.path().c_str()));
}

TEST_F(EaUpgradeTest, AProcessInTheLegacyFolderItselfStaysInIt) {
    MakeFolder(two_);
    ASSERT_EQ(0, chdir(folder_.c_str()));
    const auto before = CurrentInode();
    EXPECT_EQ(0, MAVOEAUpgrade("../../a.txt", kStream));
    EXPECT_EQ(before, CurrentInode());
    EXPECT_EQ(two_, InStream());
    EXPECT_FALSE(Exists(folder_));
    ASSERT_EQ(0, chdir(cwd_.path().c_str()));
}

TEST_F(EaUpgradeTest, AProcessThatMayNotSearchItsDirectoryStaysInItAndUpgradesAllTheSame) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MakeFolder({{"MAVO:Resource", Ascii("resource")}});
    MakeFolder(two_);
    const TempDir closed;
    ASSERT_EQ(0, chmod(closed.path().c_str(), 0700));
    ASSERT_EQ(0, chdir(closed.path().c_str()));
    AsUser(kUser, Root::kGivenUp, [&] {
        ASSERT_NE(0, chdir("."));
        EXPECT_EQ(0, UpgradeStream());
        EXPECT_EQ(0, MAVOEAUpgrade(object_.c_str(), kResource));
        EXPECT_EQ(closed.path(), CurrentDirectory());
    });
    ASSERT_EQ(0, chdir(cwd_.path().c_str()));
    EXPECT_EQ(two_, InStream());
    EXPECT_EQ(Ascii("resource"), ContentsOf(resource_));
    EXPECT_FALSE(Exists(folder_));
}

// What somebody puts in the folder's place while it is read is neither converted nor removed.
TEST_F(EaUpgradeTest, OnlyTheFolderThatWasOpenedIsConverted) {
    MakeFolder(two_);
    const std::string elsewhere = dir_ / "elsewhere";
    Hooks().before = [&](const std::string& name) {
        if (name != "readdir" || Exists(elsewhere)) return;
        std::filesystem::rename(folder_, elsewhere);
        MakeFolder({{"color", Ascii("another")}});
    };
    EXPECT_EQ(0, UpgradeStream());
    EXPECT_EQ(two_, InStream());
    EXPECT_EQ((Values{{"color", Ascii("another")}}), InFolder());
    EXPECT_THAT(NamesIn(elsewhere), IsEmpty());
    ExpectNothingReported();
}

// ---- Streams: every call that can fail ----------------------------------------------------------

TEST_F(EaUpgradeTest, WhateverFailsNoAttributeFileIsLost) {
    Values values = two_;
    values["empty"] = {};
    values["large"] = Pattern(20000);
    int calls = 0;
    FailEachCall([&] { MakeFolder(values); }, [this] { return UpgradeStream(); },
                 [&](int result, const std::string& failed) {
                     ExpectNothingLost(values);
                     EXPECT_THAT(result, AnyOf(0, -1));
                     if (failed.empty()) {
                         EXPECT_EQ(0, result);
                         EXPECT_EQ(values, InStream());
                         EXPECT_FALSE(Exists(folder_));
                         ExpectNothingReported();
                     }
                 },
                 &calls);
    EXPECT_LE(30, calls);
}

TEST_F(EaUpgradeTest, WhateverFailsNoSidecarIsLost) {
    FailEachCall(
        [&] {
            MakeFolder(two_, 100);
            MakeSidecar(SmallSidecar(), 200);
        },
        [this] { return UpgradeStream(); },
        [&](int result, const std::string& failed) {
            ExpectNothingLost(two_);
            if (Exists(sidecar_)) {
                EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));
            } else {
                EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
            }
            if (failed.empty()) {
                EXPECT_EQ(0, result);
                EXPECT_EQ(SmallSidecar(), ContentsOf(stream_));
                EXPECT_EQ(two_, InFolder());
            }
        });
}

TEST_F(EaUpgradeTest, WhateverFailsAStreamThatIsThereStaysAsItIs) {
    StreamImage image;
    image.attributes = {{"color", Ascii("red, and newer than the file")}};
    const Bytes stream = image.Build();
    for (const time_t sidecar_time : {50, 200}) {
        SCOPED_TRACE(sidecar_time);
        FailEachCall(
            [&] {
                MakeFolder(two_, 100);
                MakeSidecar(SmallSidecar(), sidecar_time);
                MakeStream(stream);
            },
            [this] { return UpgradeStream(); },
            [&](int result, const std::string& failed) {
                EXPECT_EQ(stream, ContentsOf(stream_));
                EXPECT_EQ(two_, InFolder());
                EXPECT_EQ(SmallSidecar(), ContentsOf(sidecar_));
                EXPECT_THAT(result, AnyOf(1, -1));
                if (failed.empty()) {
                    EXPECT_EQ(1, result);
                }
            });
    }
}

// ---- Resource files -----------------------------------------------------------------------------

// An AppleDouble file with these marks where its descriptors say, between other bytes.
Bytes ResourceFile(std::optional<std::uint32_t> afp_attributes,
                   std::optional<std::uint32_t> finder_flags, bool finder_first = true) {
    Bytes file = Hex("00 05 16 07  00 02 00 00  00*16  00 03 "
                     "00 00 00 02  00 00 00 C8  00 00 00 04"  // resource fork: 200, 4
                     "00*24") +
                 Repeat(0xFF, 142);
    PutU32(file, 200, 0x464F524B);
    const std::size_t finder_at = finder_first ? 38 : 50;
    const std::size_t afp_at = finder_first ? 50 : 38;
    PutU32(file, finder_at, finder_flags ? 9 : 4);  // 4 is a comment
    PutU32(file, finder_at + 4, 80);
    PutU32(file, finder_at + 8, 32);
    PutU32(file, afp_at, afp_attributes ? 14 : 8);  // 8 are dates
    PutU32(file, afp_at + 4, 160);
    PutU32(file, afp_at + 8, 4);
    if (finder_flags) PutU16(file, 88, *finder_flags);
    if (afp_attributes) PutU16(file, 162, *afp_attributes);
    return file;
}

class EaUpgradeResourceTest : public EaUpgradeTest {
 protected:
    void MakeLegacy(const Bytes& bytes) const { MakeFolder({{"MAVO:Resource", bytes}}); }

    int Upgrade() const { return MAVOEAUpgrade(object_.c_str(), kResource); }

    // The calls since the last time that mark the object.
    static std::vector<std::string> TakeMarks() {
        std::vector<std::string> calls = TakeCalls();
        std::erase_if(calls, [](const std::string& call) {
            return !call.starts_with("chmod(") && !call.starts_with("command(");
        });
        return calls;
    }

    // The file has been moved whatever it holds, the object has its old mode, nobody marked it.
    void ExpectMovedWithoutMarks(const Bytes& bytes, int code) {
        TakeCalls();
        EXPECT_EQ(0, Upgrade());
        EXPECT_EQ(bytes, ContentsOf(resource_));
        EXPECT_FALSE(Exists(folder_));
        ExpectOnly(code, kUnit);
        EXPECT_THAT(TakeLog(), IsEmpty());
        EXPECT_THAT(TakeMarks(), IsEmpty());
        EXPECT_EQ(0644, ModeOf(object_));
    }

    const std::string set_hidden_ = "command(" + object_ + ", 515)";
    const std::string clear_hidden_ = "command(" + object_ + ", 518)";
};

// Promise: "MAVOEAUpgrade: MAVOEA_KIND_RESOURCE"
// Promise: "Where metadata lies: `D/@eaDir/N/`"
TEST_F(EaUpgradeResourceTest, TheFileMovesAsItIsAndTheFolderGoes) {
    const Bytes bytes = ResourceFile(0, 0);
    MakeLegacy(bytes);
    TakePlatformCalls();
    EXPECT_EQ(0, Upgrade());
    EXPECT_EQ(bytes, ContentsOf(resource_));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt@MavoResource"));
    EXPECT_THAT(TakePlatformCalls(), ElementsAre("MLIBCFileStat(" + object_ + ", 3)"));
    ExpectNothingReported();
    EXPECT_EQ(1, Upgrade());
}

TEST_F(EaUpgradeResourceTest, AFolderWithMoreInItIsKept) {
    MakeFolder(two_);
    MakeLegacy(ResourceFile(0, 0));
    EXPECT_EQ(0, Upgrade());
    EXPECT_EQ(two_, InFolder());
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: 1 the current"
TEST_F(EaUpgradeResourceTest, AFileOfTheCurrentLayoutIsLeftAsItIs) {
    MakeLegacy(ResourceFile(0x21, 0x4000));
    WriteFile(resource_, Ascii("current"));
    TakeCallNames();
    EXPECT_EQ(1, Upgrade());
    EXPECT_THAT(TakeCallNames(), ElementsAre("access"));
    EXPECT_EQ(Ascii("current"), ContentsOf(resource_));
    EXPECT_EQ(ResourceFile(0x21, 0x4000), ContentsOf(legacy_resource_));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: 2 there is nothing"
TEST_F(EaUpgradeResourceTest, NoFileInEitherLayoutGives2AndRemovesNothing) {
    EXPECT_EQ(2, Upgrade());
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("a.txt"));
    MakeFolder({});
    TakeCallNames();
    EXPECT_EQ(2, Upgrade());
    EXPECT_THAT(TakeCallNames(), ElementsAre("access", "access"));
    EXPECT_TRUE(Exists(folder_));
    MakeFolder(two_);
    MakeSidecar(SmallSidecar(), 200);
    EXPECT_EQ(2, Upgrade());
    EXPECT_EQ(two_, InFolder());
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: 0x2800"
TEST_F(EaUpgradeResourceTest, AFileThatCannotBeRenamedFailsWith0x2800AndStays) {
    MakeLegacy(ResourceFile(0x21, 0));
    TakeCalls();
    const FailCall fault("rename", EIO);
    EXPECT_EQ(-1, Upgrade());
    ExpectOnly(0x2800, kUnit);
    EXPECT_EQ(ResourceFile(0x21, 0), ContentsOf(legacy_resource_));
    EXPECT_THAT(TakeMarks(), IsEmpty());
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_THAT(TakeLog(), IsEmpty());
}

// Promise: "MAVOEAUpgrade: 0x3900"
TEST_F(EaUpgradeResourceTest, AFolderThatCannotBeRemovedFailsWith0x3900) {
    for (const int error : {EBUSY, EACCES, ENOTDIR}) {
        SCOPED_TRACE(strerror(error));
        StartAgain();
        MakeLegacy(ResourceFile(0, 0));
        const FailCall fault("rmdir", error);
        EXPECT_EQ(-1, Upgrade());
        ExpectOnly(0x3900, kUnit);
        EXPECT_TRUE(Exists(resource_));
    }
    for (const int error : {ENOENT, ENOTEMPTY}) {
        SCOPED_TRACE(strerror(error));
        StartAgain();
        MakeLegacy(ResourceFile(0, 0));
        const FailCall fault("rmdir", error);
        EXPECT_EQ(0, Upgrade());
        ExpectNothingReported();
    }
    EXPECT_THAT(TakeLog(), IsEmpty());
}

TEST_F(EaUpgradeResourceTest, AFileOfALongNameGetsTheShortenedName) {
    const std::string name(250, 'a');  // see TheStreamOfALongNameHasTheShortenedName
    const std::string folder = ea_dir_ + "/" + name;
    std::filesystem::create_directories(folder);
    WriteFile(folder + "/MAVO:Resource", ResourceFile(0, 0));
    WriteFile(dir_ / name, Ascii("data"));
    EXPECT_EQ(0, MAVOEAUpgrade((dir_ / name).c_str(), kResource));
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre(std::string(241, 'a') + "x@MavoResource"));
    ExpectNothingReported();
}

TEST_F(EaUpgradeResourceTest, ObjectPathsMayBeRelativeAndEndInASlash) {
    ASSERT_EQ(0, chdir(dir_.path().c_str()));
    MakeLegacy(ResourceFile(0x20, 0));
    EXPECT_EQ(0, MAVOEAUpgrade("a.txt", kResource));
    EXPECT_EQ(0444, ModeOf(object_));
    EXPECT_TRUE(Exists(resource_));

    StartAgain();
    std::filesystem::remove(object_);
    std::filesystem::create_directory(object_);
    MakeLegacy(ResourceFile(0, 0));
    ASSERT_EQ(0, chmod(object_.c_str(), 0755));
    EXPECT_EQ(0, MAVOEAUpgrade((object_ + "/").c_str(), kResource));
    EXPECT_EQ(0777, ModeOf(object_));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: the object gets its marks"
// Promise: "AppleDouble: Of the ids"
TEST_F(EaUpgradeResourceTest, EveryCombinationOfMarksIsCarriedOntoTheObject) {
    using Bits = std::optional<std::uint32_t>;
    for (const Bits afp :
         {Bits(), Bits(0), Bits(0x0020), Bits(0x0001), Bits(0x0021), Bits(0xFFDE)}) {
        for (const Bits finder : {Bits(), Bits(0), Bits(0x4000), Bits(0xBFFF), Bits(0xFFFF)}) {
            if (!afp && !finder) continue;
            for (const mode_t mode : {0644u, 0444u, 0402u, 04711u}) {
                for (const std::uint32_t word : {0u, 4u, ~4u}) {
                    SCOPED_TRACE(::testing::Message()
                                 << std::hex << "AFP attributes " << afp.value_or(0x10000)
                                 << ", Finder flags " << finder.value_or(0x10000) << ", mode 0"
                                 << std::oct << mode << ", word " << std::hex << word);
                    const Bytes bytes = ResourceFile(afp, finder, word == 0);
                    std::filesystem::remove(resource_);
                    MakeLegacy(bytes);
                    ASSERT_EQ(0, chmod(object_.c_str(), mode));
                    Platform().file_stat = [word](const std::string& path, unsigned char* info) {
                        struct stat found;
                        if (stat(path.c_str(), &found) != 0) return -1;
                        const std::uint32_t found_mode = found.st_mode;
                        memcpy(info + 16, &found_mode, sizeof found_mode);
                        memcpy(info + 116, &word, sizeof word);
                        return 0;
                    };
                    TakeCalls();
                    ASSERT_EQ(0, Upgrade());
                    EXPECT_EQ(bytes, ContentsOf(resource_));

                    const bool read_only =
                        (afp && (*afp & 0x0020) != 0) || (mode & mode_t{0222}) == 0;
                    const bool invisible = (afp && (*afp & 0x0001) != 0) ||
                                           (finder && (*finder & 0x4000) != 0) || (word & 4) != 0;
                    EXPECT_EQ(
                        static_cast<int>(read_only ? mode & ~mode_t{0222} : mode | mode_t{0222}),
                        ModeOf(object_));
                    const auto marks = TakeMarks();
                    ASSERT_EQ(2u, marks.size());
                    EXPECT_TRUE(marks[0].starts_with("chmod(" + object_ + ", ")) << marks[0];
                    EXPECT_EQ(invisible ? set_hidden_ : clear_hidden_, marks[1]);
                }
            }
        }
    }
    ExpectNothingReported();
}

TEST_F(EaUpgradeResourceTest, OnlyTheVersionIsCheckedAndNotTheMagic) {
    Bytes bytes = ResourceFile(0x0021, 0);
    PutU32(bytes, 0, 0x12345678);
    MakeLegacy(bytes);
    TakeCalls();
    EXPECT_EQ(0, Upgrade());
    EXPECT_EQ(0444, ModeOf(object_));
    EXPECT_THAT(TakeMarks(), Contains(set_hidden_));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: and for marks"
TEST_F(EaUpgradeResourceTest, AFileOfAnotherVersionGivesNoMarks) {
    for (const std::uint32_t version : {0x00010000u, 0x00020001u, 0x00000200u, 0u}) {
        SCOPED_TRACE(version);
        StartAgain();
        Bytes bytes = ResourceFile(0x0021, 0x4000);
        PutU32(bytes, 4, version);
        MakeLegacy(bytes);
        ExpectMovedWithoutMarks(bytes, 0x4000);
    }
}

// Promise: "MAVOEAUpgrade: and for marks"
TEST_F(EaUpgradeResourceTest, AFileWithNeitherEntryGivesNoMarks) {
    MakeLegacy(ResourceFile({}, {}));
    ExpectMovedWithoutMarks(ResourceFile({}, {}), 0x4000);

    StartAgain();
    const Bytes none = Hex("00 05 16 07  00 02 00 00  00*16  00 00");
    MakeLegacy(none);
    ExpectMovedWithoutMarks(none, 0x4000);
}

// Cut at every length: the marks end at 164, and no byte behind them is looked at.
TEST_F(EaUpgradeResourceTest, AFileThatIsCutShortGivesNoMarks) {
    const Bytes whole = ResourceFile(0x0021, 0x4000);
    for (std::size_t size = 0; size < 164; ++size) {
        SCOPED_TRACE(size);
        StartAgain();
        const Bytes bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size));
        MakeLegacy(bytes);
        ExpectMovedWithoutMarks(bytes, 0xA00);
    }
    StartAgain();
    MakeLegacy(Bytes(whole.begin(), whole.begin() + 164));
    EXPECT_EQ(0, Upgrade());
    EXPECT_EQ(0444, ModeOf(object_));
    ExpectNothingReported();
}

TEST_F(EaUpgradeResourceTest, MarksBehindTheEndOfTheFileAreNotThere) {
    for (const std::uint32_t offset : {203u, 0x7FFFFFFFu, 0xFFFFFFF8u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(offset);
        for (const std::size_t field : {42u, 54u}) {  // Finder info, AFP file info
            StartAgain();
            Bytes bytes = ResourceFile(0x0021, 0x4000);
            PutU32(bytes, field, offset);
            MakeLegacy(bytes);
            ExpectMovedWithoutMarks(bytes, 0xA00);
        }
    }
}

TEST_F(EaUpgradeResourceTest, MoreDescriptorsThanTheFileHoldsGiveNoMarks) {
    Bytes bytes = ResourceFile(0x0021, 0x4000);
    PutU16(bytes, 24, 0xFFFF);
    MakeLegacy(bytes);
    ExpectMovedWithoutMarks(bytes, 0xA00);
}

// Promise: "MAVOEAUpgrade: and for marks"
TEST_F(EaUpgradeResourceTest, AFileThatCannotBeOpenedOrReadGivesNoMarks) {
    const Bytes bytes = ResourceFile(0x0021, 0x4000);
    MakeLegacy(bytes);
    {
        const FailCall fault("open", EACCES, 2);
        ExpectMovedWithoutMarks(bytes, 0x900);
    }
    for (int nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        ASSERT_LT(nth, 20);
        StartAgain();
        MakeLegacy(bytes);
        const FailCall fault("pread", EIO, nth);
        TakeCalls();
        EXPECT_EQ(0, Upgrade());
        if (!fault.fired()) {
            EXPECT_LT(3, nth);  // header, descriptors, both marks
            break;
        }
        ExpectOnly(0xA00, kUnit);
        EXPECT_THAT(TakeMarks(), IsEmpty());
        EXPECT_FALSE(Exists(folder_));
    }
}

TEST_F(EaUpgradeResourceTest, AnObjectOfUnknownStatusIsMarkedFromTheFileAndKeepsItsMode) {
    Platform().file_stat = [](const std::string&, unsigned char*) { return -1; };
    MakeLegacy(ResourceFile(0x0021, 0));
    TakeCalls();
    EXPECT_EQ(0, Upgrade());
    EXPECT_THAT(TakeMarks(), ElementsAre(set_hidden_));
    EXPECT_EQ(0644, ModeOf(object_));

    StartAgain();
    MakeLegacy(ResourceFile(0, 0));
    EXPECT_EQ(0, Upgrade());
    EXPECT_THAT(TakeMarks(), ElementsAre(clear_hidden_));
    ExpectNothingReported();
}

TEST_F(EaUpgradeResourceTest, AnObjectThatIsMissingIsNoFailure) {
    std::filesystem::remove(object_);
    MakeLegacy(ResourceFile(0x0021, 0));
    Hooks().command = [](const char*, int) { return errno = ENOENT, -1; };
    EXPECT_EQ(0, Upgrade());
    EXPECT_TRUE(Exists(resource_));
    EXPECT_FALSE(Exists(folder_));
}

TEST_F(EaUpgradeResourceTest, MarksThatCannotBeSetAreNoFailure) {
    MakeLegacy(ResourceFile(0x0021, 0));
    {
        const FailCall fault("chmod", EPERM);
        TakeCalls();
        EXPECT_EQ(0, Upgrade());
        EXPECT_THAT(TakeMarks(), Contains(set_hidden_));
    }
    EXPECT_FALSE(Exists(folder_));

    StartAgain();
    MakeLegacy(ResourceFile(0x0021, 0));
    const FailCall fault("command", ENOSYS);
    EXPECT_EQ(0, Upgrade());
    EXPECT_EQ(0444, ModeOf(object_));
    EXPECT_FALSE(Exists(folder_));
    ExpectNothingReported();
}

TEST_F(EaUpgradeResourceTest, WhateverFailsTheFileIsNotLost) {
    const Bytes bytes = ResourceFile(0x0021, 0x4000);
    FailEachCall([&] { MakeLegacy(bytes); }, [this] { return Upgrade(); },
                 [&](int result, const std::string& failed) {
                     EXPECT_EQ(bytes, ContentsOf(Exists(resource_) ? resource_ : legacy_resource_));
                     EXPECT_NE(Exists(resource_), Exists(legacy_resource_));
                     const bool fails = failed == "access" || failed == "rename" ||
                                        failed == "rmdir" ||
                                        (failed == "open" && !Exists(resource_));
                     EXPECT_EQ(fails, result == -1);
                     if (failed.empty()) {
                         EXPECT_EQ(0, result);
                         EXPECT_EQ(0444, ModeOf(object_));
                     }
                 });
}

TEST_F(EaUpgradeResourceTest, WhateverFailsAFileOfTheCurrentLayoutStaysAsItIs) {
    FailEachCall(
        [&] {
            MakeLegacy(ResourceFile(0x0021, 0x4000));
            WriteFile(resource_, Ascii("current"));
        },
        [this] { return Upgrade(); },
        [&](int result, const std::string&) {
            EXPECT_EQ(Ascii("current"), ContentsOf(resource_));
            EXPECT_TRUE(Exists(legacy_resource_));
            EXPECT_THAT(result, AnyOf(1, -1));
        });
}

// ---- Other reserved names -----------------------------------------------------------------------

class EaUpgradeReservedTest : public EaUpgradeTest {
 protected:
    int Upgrade(const char* kind) const { return MAVOEAUpgrade(object_.c_str(), kind); }
};

// Promise: "MAVOEAUpgrade: other "MAVO...""
TEST_F(EaUpgradeReservedTest, TheFileMovesWithinTheFolder) {
    MakeFolder({{"MAVO:x", Ascii("x")}, {"color", Ascii("blue")}});
    EXPECT_EQ(0, Upgrade("MAVO:x"));
    EXPECT_THAT(TakePlatformCalls(),
                ElementsAre("MLIBCExec(/bin/mv, " + folder_ + "/MAVO:x, " + folder_ + "/MAVO@x)"));
    EXPECT_EQ((Values{{"MAVO@x", Ascii("x")}, {"color", Ascii("blue")}}), InFolder());
    EXPECT_THAT(NamesIn(ea_dir_), ElementsAre("a.txt"));
    EXPECT_EQ(1, Upgrade("MAVO:x"));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: other "MAVO...""
TEST_F(EaUpgradeReservedTest, OnlyTheLastColonIsReplaced) {
    MakeFolder({{"MAVO:a:b", Ascii("ab")}, {"MAVOc:", Ascii("c")}});
    EXPECT_EQ(0, Upgrade("MAVO:a:b"));
    EXPECT_EQ(0, Upgrade("MAVOc:"));
    EXPECT_EQ((Values{{"MAVO:a@b", Ascii("ab")}, {"MAVOc@", Ascii("c")}}), InFolder());
    ExpectNothingReported();
}

TEST_F(EaUpgradeReservedTest, TheLegacyResourceFileIsAReservedNameAsWell) {
    MakeFolder({{"MAVO:Resource", ResourceFile(0x0021, 0)}});
    TakeCalls();
    EXPECT_EQ(0, Upgrade("MAVO:Resource"));
    EXPECT_THAT(NamesIn(folder_), ElementsAre("MAVO@Resource"));
    EXPECT_EQ(0644, ModeOf(object_));
    EXPECT_THAT(TakeCalls(), Not(Contains(::testing::StartsWith("command("))));
}

TEST_F(EaUpgradeReservedTest, AMovedFileGives1AndAMissingOne2) {
    EXPECT_EQ(2, Upgrade("MAVO:x"));
    MakeFolder({{"MAVO:x", Ascii("x")}, {"MAVO@x", Ascii("moved before")}});
    EXPECT_EQ(1, Upgrade("MAVO:x"));
    EXPECT_EQ((Values{{"MAVO:x", Ascii("x")}, {"MAVO@x", Ascii("moved before")}}), InFolder());
    EXPECT_EQ(2, Upgrade("MAVO:y"));
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

TEST_F(EaUpgradeReservedTest, WithoutAColonBothNamesAreTheSame) {
    ASSERT_EQ(std::string::npos, folder_.find(':'));
    MakeFolder({{"MAVOx", Ascii("x")}});
    EXPECT_EQ(1, Upgrade("MAVOx"));
    EXPECT_EQ(2, Upgrade("MAVOy"));
    EXPECT_EQ(2, Upgrade("MAVO"));
    EXPECT_EQ((Values{{"MAVOx", Ascii("x")}}), InFolder());
    EXPECT_THAT(TakePlatformCalls(), IsEmpty());
    ExpectNothingReported();
}

// The last colon of the whole path, whose directories may have some.
// Promise: "MAVOEAUpgrade: 0 converted"
TEST_F(EaUpgradeReservedTest, AColonOfTheObjectsPathIsReplacedWhereTheKindHasNone) {
    const std::string folder = dir_ / "b:c/@eaDir/d";
    std::filesystem::create_directories(folder);
    WriteFile(folder + "/MAVOx", Ascii("x"));
    const std::string moved = dir_ / "b@c/@eaDir/d/MAVOx";
    EXPECT_EQ(0, MAVOEAUpgrade((dir_ / "b:c/d").c_str(), "MAVOx"));  // mv itself has failed
    EXPECT_THAT(TakePlatformCalls(),
                ElementsAre("MLIBCExec(/bin/mv, " + folder + "/MAVOx, " + moved + ")"));
    EXPECT_EQ(Ascii("x"), ContentsOf(folder + "/MAVOx"));

    std::filesystem::create_directories(dir_ / "b@c/@eaDir/d");
    EXPECT_EQ(0, MAVOEAUpgrade((dir_ / "b:c/d").c_str(), "MAVOx"));
    EXPECT_EQ(Ascii("x"), ContentsOf(moved));
    ExpectNothingReported();
}

// Promise: "MAVOEAUpgrade: 0 converted"
// Promise: "MAVOEAUpgrade: no code where"
TEST_F(EaUpgradeReservedTest, OnlyACommandThatCouldNotBeRunIsAFailure) {
    MakeFolder({{"MAVO:x", Ascii("x")}});
    for (const auto& [status, result] : {std::pair{0, 0}, {1, 0}, {127, 0}, {255, 0}, {-1, -1}}) {
        SCOPED_TRACE(status);
        Platform().exec = [status = status](const std::vector<std::string>&) { return status; };
        EXPECT_EQ(result, Upgrade("MAVO:x"));
        EXPECT_EQ(Ascii("x"), ContentsOf(folder_ + "/MAVO:x"));
    }
    EXPECT_EQ(5u, TakePlatformCalls().size());
    ExpectNothingReported();
}

TEST_F(EaUpgradeReservedTest, TheFolderStaysAndTheOtherLayoutsAreNotLookedAt) {
    MakeFolder({{"MAVO:x", Ascii("x")}});
    MakeSidecar(SmallSidecar(), 200);
    TakeCallNames();
    EXPECT_EQ(0, Upgrade("MAVO:x"));
    EXPECT_THAT(TakeCallNames(), ElementsAre("access", "access", "open", "close"));
    EXPECT_TRUE(Exists(folder_ + "/MAVO@x"));
}

TEST_F(EaUpgradeReservedTest, WhateverFailsAFileThatMovedBeforeStaysAsItIs) {
    FailEachCall(
        [&] {
            MakeFolder({{"MAVO:x", Ascii("x")}, {"MAVO@x", Ascii("moved before")}});
        },
        [this] { return Upgrade("MAVO:x"); },
        [&](int result, const std::string&) {
            EXPECT_EQ(Ascii("moved before"), ContentsOf(folder_ + "/MAVO@x"));
            EXPECT_THAT(result, AnyOf(1, -1));
        });
}

}  // namespace
}  // namespace mavoea::test

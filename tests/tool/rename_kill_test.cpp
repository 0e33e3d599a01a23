// A rename that is killed: the same command again brings everything to its place, and nothing is
// lost or given to another object.

#include <signal.h>
#include <sys/wait.h>

#include <map>
#include <random>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/second_volume.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/case_volume.h"
#include "tests/tool/holdings.h"
#include "tests/tool/kills.h"
#include "tests/tool/stopped_tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::AnyOf;
using ::testing::Eq;
using ::testing::IsEmpty;

// ---- What is renamed ----------------------------------------------------------------------------

enum class What { kFile, kDirectory };

struct Case {
    int type;
    What what;
    bool replaces;   // an object that has metadata too
    bool elsewhere;  // into another directory
    Extent extent = Extent::kAll;
    std::string from = "old";
    std::string to = "new name";
};

std::string NameOf(const Case& tested) {
    std::string name = "Type" + std::to_string(tested.type);
    name += tested.what == What::kFile ? "File" : "Directory";
    if (tested.replaces) name += "Replacing";
    if (tested.elsewhere) name += "Elsewhere";
    if (tested.from.size() > 200) name += "Long";
    if (tested.extent == Extent::kOwnOnly) name += "OwnOnly";
    return name;
}

void PrintTo(const Case& tested, std::ostream* out) { *out << NameOf(tested); }

std::vector<Case> AllCases() {
    std::vector<Case> cases;
    for (const int type : Types({kAppleDouble, kEaDirectory, kFileEa, kXattr})) {
        for (const bool elsewhere : {false, true}) {
            for (const bool replaces : {false, true}) {
                cases.push_back({type, What::kFile, replaces, elsewhere});
            }
        }
        cases.push_back({type, What::kFile, true, true, Extent::kOwnOnly});
        cases.push_back({type, What::kDirectory, false, true});
    }
    const std::string head(238, 'n');
    cases.push_back({kEaDirectory, What::kFile, true, false, Extent::kAll, head + " is old.txt",
                     head + " new.txt"});
    return Thinned(cases);
}

class RenameKillTest : public ::testing::TestWithParam<Case> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(directory_);
        MAVOEA_SKIP_UNLESS_STOPPED();
        root_.emplace(directory_);
        arguments_ = {"--volume", root_->path() + "=" + std::to_string(GetParam().type),
                      "mv",       "-f",
                      "-T",       From(),
                      To()};
    }

    const std::string& root() const { return root_->path(); }
    std::string From() const { return *root_ / ("a/" + GetParam().from); }
    std::string To() const {
        return *root_ / ((GetParam().elsewhere ? "b/" : "a/") + GetParam().to);
    }

    // The two directories as they are before the rename.
    void MakeAll() const {
        for (const char* name : {"a", "b"}) {
            std::filesystem::remove_all(*root_ / name);
            MakeDir(*root_ / name);
        }
        WriteFile(*root_ / "a/stays", Ascii("data of another"));
        Give(*root_ / "a/stays", "white");
        if (GetParam().what == What::kDirectory) {
            MakeDir(From());
            WriteFile(From() + "/inside", Ascii("data inside"));
            Give(From() + "/inside", "green");
        } else {
            WriteFile(From(), Ascii("data"));
        }
        Give(From(), "blue");
        if (!GetParam().replaces) return;
        WriteFile(To(), Ascii("data of the replaced"));
        Give(To(), "red");
    }
    void Give(const std::string& object, const std::string& colour) const {
        GiveAll(GetParam().type, object, colour, GetParam().extent);
    }

    // After a run that nobody disturbs.
    std::map<std::string, Bytes> Done() const {
        MakeAll();
        EXPECT_THAT(RunTool(arguments_), Succeeded());
        return Everything(root());
    }

    // Calls `go_on` after each run that was killed.
    void KillAtEachCall(const std::function<void()>& go_on) const {
        KillAtEachChange(
            arguments_, root(), [this] { MakeAll(); }, go_on);
    }

    // The same command, once more. Where nothing was left to do it finds nothing to rename.
    void RunAgain() const {
        const ToolResult result = RunTool(arguments_);
        EXPECT_THAT(result.status, AnyOf(Eq(0), Eq(1))) << result.err;
        if (result.status == 1) {
            EXPECT_THAT(result.err, ::testing::HasSubstr(From() + "': No such file"));
        }
    }

    Arguments arguments_;

    std::optional<TempDir> root_;
    std::string directory_ = FastDirectory();
};
INSTANTIATE_TEST_SUITE_P(Everything, RenameKillTest, ::testing::ValuesIn(AllCases()),
                         [](const auto& tested) { return NameOf(tested.param); });

// Promise: "The tool: So a metadata file"
// Promise: "The tool: `tests/tool/rename_kill_test.cpp`"
// Promise: "The tool: `mv` on one volume"
TEST_P(RenameKillTest, TheSameCommandAgainBringsItToItsEnd) {
    const auto done = Done();
    KillAtEachCall([&] {
        RunAgain();
        EXPECT_THAT(Differences(done, Everything(root())), IsEmpty());
    });
}

// What an object has, but for its folder, which stays pending until the rename is tried again.
bool HasAllOf(const Holdings& found, const Holdings& wanted) {
    return found.attributes == wanted.attributes && found.forks == wanted.forks &&
           found.finder_infos == wanted.finder_infos && found.entries == wanted.entries &&
           std::all_of(wanted.others.begin(), wanted.others.end(), [&](const auto& other) {
               const auto there = found.others.find(other.first);
               return other.first.starts_with('/') ||
                      (there != found.others.end() && there->second == other.second);
           });
}

// Promise: "The tool: `mv` on one volume"
TEST_P(RenameKillTest, CleanTakesNothingOfItAndTheSameCommandFinishesItAfterThat) {
    const int type = GetParam().type;
    const auto done = Done();
    const Holdings renamed = HoldingsOf(type, To());
    MakeAll();
    const Holdings replaced = Exists(To()) ? HoldingsOf(type, To()) : Holdings();
    KillAtEachCall([&] {
        const ToolResult clean =
            RunTool({arguments_[0], arguments_[1], "clean", "-r", "--yes", "--wait", "0", root()});
        EXPECT_EQ(0, clean.status) << clean.err;
        if (Exists(From())) {
            EXPECT_TRUE(HasAllOf(HoldingsOf(type, From()), renamed));
            if (Exists(To())) {
                EXPECT_TRUE(HasAllOf(HoldingsOf(type, To()), replaced));
            }
        } else {
            EXPECT_TRUE(HasAllOf(HoldingsOf(type, To()), renamed));
        }
        RunAgain();
        std::vector<std::string> differences = Differences(done, Everything(root()));
        // What a service keeps is not removed without being asked for, from wherever it came.
        if (GetParam().elsewhere) {
            std::erase(differences,
                       "left: a/@eaDir/" + ShortenedName(GetParam().from) + '@' + kServiceKind);
        }
        EXPECT_THAT(differences, IsEmpty());
    });
}

// Whatever has come to the old name meanwhile.
TEST_P(RenameKillTest, ANewObjectOfTheOldNameGetsNothingOfIt) {
    if (GetParam().what == What::kDirectory) GTEST_SKIP() << "a directory is no file's successor";
    const auto done = Done();
    KillAtEachCall([&] {
        const bool gone = !Exists(From());
        if (gone) WriteFile(From(), Ascii("data of a new one"));
        RunAgain();
        if (!gone) return;
        const Holdings holdings = HoldingsOf(GetParam().type, To());
        EXPECT_EQ("data of a new one", TextOf(To()));
        EXPECT_TRUE(holdings.attributes.empty());
        EXPECT_TRUE(holdings.forks.empty());
        EXPECT_TRUE(holdings.others.empty());
    });
}

// File systems give the inode number of a removed file to the next one, but in memory.
class ReusedInodeTest : public RenameKillTest {
 protected:
    ReusedInodeTest() { directory_ = std::filesystem::temp_directory_path(); }
};
INSTANTIATE_TEST_SUITE_P(EveryKind, ReusedInodeTest,
                         ::testing::Values(Case{kAppleDouble, What::kFile, false, true},
                                           Case{kEaDirectory, What::kFile, true, false}),
                         [](const auto& tested) { return NameOf(tested.param); });

TEST_P(ReusedInodeTest, ANewObjectOfTheNewNameGetsNothingOfIt) {
    KillAtEachCall([&] {
        if (Exists(From())) return;
        ASSERT_EQ(0, unlink(To().c_str()));
        // What had its place has to be removed, as a service would.
        const MetadataPaths there(To());
        std::filesystem::remove(there.apple_double);
        for (const std::string& path :
             {there.stream, there.resource, there.folder,
              there.ea_directory + '/' + ShortenedName(GetParam().to) + '@' + kServiceKind}) {
            std::filesystem::remove_all(path);
        }
        WriteFile(To(), Ascii("data of a new one"));
        const std::string last = *root_ / "b/last";
        EXPECT_THAT(
            RunTool({"--volume", root() + "=" + std::to_string(GetParam().type), "mv", To(), last}),
            Succeeded());
        EXPECT_EQ("data of a new one", TextOf(last));
        const Holdings holdings = HoldingsOf(GetParam().type, last);
        EXPECT_TRUE(holdings.attributes.empty());
        EXPECT_TRUE(holdings.forks.empty());
        EXPECT_TRUE(holdings.others.empty());
    });
}

// ---- File systems of other kinds ----------------------------------------------------------------

class RenameKillVolumeTest : public ::testing::TestWithParam<int> {
 protected:
    // Renames a/OLD to NEW on the volume, killed at each change, and goes on from there.
    void Rename(const CaseVolume& volume, const std::string& old, const std::string& renamed) {
        MAVOEA_SKIP_WITHOUT_CASE_VOLUME(volume);
        MAVOEA_SKIP_UNLESS_STOPPED();
        const std::string root = volume.path() + "/a";
        const Arguments arguments = {"--volume", root + "=" + std::to_string(GetParam()), "mv",
                                     root + '/' + old, root + '/' + renamed};
        const auto make = [&] {
            std::filesystem::remove_all(root);
            MakeDir(root);
            WriteFile(root + '/' + old, Ascii("data"));
            GiveAll(GetParam(), root + '/' + old, "blue");
        };
        make();
        ASSERT_THAT(RunTool(arguments), Succeeded());
        const auto done = Everything(root);
        ASSERT_TRUE(done.contains(renamed));
        KillAtEachChange(arguments, root, make, [&] {
            EXPECT_THAT(RunTool(arguments).status, AnyOf(Eq(0), Eq(1), Eq(2)));
            EXPECT_THAT(Differences(done, Everything(root)), IsEmpty());
        });
    }
};
INSTANTIATE_TEST_SUITE_P(EveryKind, RenameKillVolumeTest,
                         ::testing::ValuesIn(Types({kAppleDouble, kEaDirectory, kFileEa})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(RenameKillVolumeTest, AnotherSpellingOfTheNameIsGivenByTheSameCommandAgain) {
    Rename(CaseVolume(), "old", "Old");
}

TEST_P(RenameKillVolumeTest, WithoutHardLinksEverythingFollowsAsWell) {
    Rename(CaseVolume(HardLinks::kNone), "old", "new");
}

// ---- At any time --------------------------------------------------------------------------------

TEST(RenameKillAnyTimeTest, ManyRenamesThatAreKilledAtAnyTimeAreFinishedByTheSameCommand) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(FastDirectory());
    constexpr int kRounds = 40;
    constexpr int kObjects = 30;
    std::minstd_rand random(20240501);
    int cut_short = 0;
    for (int round = 0; round < kRounds; round += static_cast<int>(SeriesStep())) {
        SCOPED_TRACE(round);
        const TempDir root(FastDirectory());
        Arguments arguments = {"--volume", root.path() + "=1", "mv"};
        MakeDir(root / "a");
        MakeDir(root / "b");
        for (int i = 0; i < kObjects; ++i) {
            arguments.push_back(root / ("a/object " + std::to_string(i)));
            WriteFile(arguments.back(), Ascii("data of " + std::to_string(i)));
            GiveAll(kEaDirectory, arguments.back(), std::to_string(i));
        }
        const auto before = Everything(root / "a");
        arguments.push_back(root / "b");
        {
            RunningTool tool(arguments);
            // The whole takes some 10 ms.
            usleep(std::uniform_int_distribution<useconds_t>(0, 15000)(random));
            tool.Signal(SIGKILL);
            (void)tool.Wait();
        }
        const bool any_left = !Travel::ObjectsIn(root / "a").empty();
        const bool any_done = !Travel::ObjectsIn(root / "b").empty();
        if (any_left && any_done) ++cut_short;
        EXPECT_GE(1, RunTool(arguments).status);
        EXPECT_THAT(Tree(root / "a"), IsEmpty());
        EXPECT_THAT(Differences(before, Everything(root / "b")), IsEmpty());
    }
    RecordProperty("cut_short", cut_short);
}

}  // namespace
}  // namespace mavoea::test

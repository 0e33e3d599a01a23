// Nobody who may write to a share leads the superuser out of it. While the tool works on a tree,
// its directories and files turn into links to the superuser's own, before each single call that
// could notice, and as fast as another process can make them.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdio.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <memory>
#include <numeric>
#include <optional>
#include <set>

#include "tests/tool/hostile_share.h"
#include "tests/tool/stopped_tool.h"

namespace mavoea::test {
namespace {

// A command at work on a share. "@" in front of an argument stands for the directory "from", "%"
// for "to".
struct Work {
    const char* name;
    int from;
    int to;
    unsigned parts;
    Arguments arguments;
    std::vector<std::string> named;  // what may be a link, because the superuser names it
    bool two_volumes = false;
    bool only_looks = false;
};
void PrintTo(const Work& work, std::ostream* out) { *out << work.name; }

std::vector<Work> AllWork() {
    const std::vector<Work> all = {
        {"RemovingATree", 1, 1, kEaFiles, {"rm", "-r", "@tree"}, {}},
        {"RemovingATreeWithAppleDoubleFiles", 0, 0, kAppleDoubleFiles, {"rm", "-r", "@tree"}, {}},
        {"CopyingBetweenEaDirectories", 1, 1, kEaFiles, {"cp", "-r", "@tree", "%"}, {}},
        {"CopyingToAppleDoubleFiles", 1, 0, kEaFiles, {"cp", "-r", "@tree", "%"}, {}},
        {"CopyingFromAppleDoubleFiles", 0, 2, kAppleDoubleFiles, {"cp", "-r", "@tree", "%"}, {}},
        {"CopyingBetweenAttributes", 7, 7, 0, {"cp", "-r", "@tree", "%"}, {}},
        {"CopyingOverATree", 1, 1, kEaFiles | kThere, {"cp", "-r", "@tree", "%"}, {}},
        {"CopyingAFile", 1, 1, kEaFiles, {"cp", "@tree/a.txt", "%"}, {"@tree", "@tree/a.txt"}},
        {"MovingToAppleDoubleFiles", 1, 0, kEaFiles, {"mv", "@tree", "%"}, {}},
        {"MovingToAnotherFileSystem", 1, 1, kEaFiles, {"mv", "@tree", "%"}, {}, true},
        {"MovingAFileToAnotherFileSystem",
         1,
         1,
         kEaFiles,
         {"mv", "@tree/b.txt", "%"},
         {"@tree"},
         true},
        {"ConvertingToAppleDoubleFiles",
         1,
         0,
         kEaFiles,
         {"convert", "-r", "--to", "0", "@tree", "%tree"},
         {"@tree", "%tree"}},
        {"ConvertingFromAppleDoubleFiles",
         0,
         1,
         kAppleDoubleFiles,
         {"convert", "-r", "--to", "1", "@tree", "%tree"},
         {"@tree", "%tree"}},
        {"Upgrading", 1, 1, kEaFiles, {"upgrade", "-r", "@tree"}, {"@tree"}},
        {"Repairing", 1, 1, kEaFiles | kMisplaced, {"repair", "-r", "@tree"}, {"@tree"}},
        {"Mending",
         1,
         1,
         kEaFiles | kMisplaced,
         {"check", "-r", "--repair", "--yes", "@tree"},
         {"@tree"}},
        {"Cleaning",
         1,
         1,
         kEaFiles | kWithoutObject,
         {"clean", "-r", "--yes", "--wait", "0", "@tree"},
         {"@tree"}},
        {"Checking",
         1,
         1,
         kEaFiles | kWithoutObject | kMisplaced,
         {"check", "-r", "@tree"},
         {"@tree"},
         false,
         true},
        {"CheckingAppleDoubleFiles",
         0,
         0,
         kAppleDoubleFiles,
         {"check", "-r", "@tree"},
         {"@tree"},
         false,
         true},
        {"LockingByMode", 0, 0, kAppleDoubleFiles, {"lock", "-r", "@tree"}, {"@tree"}},
        {"LockingByMark", 1, 1, kEaFiles, {"lock", "-r", "@tree"}, {"@tree"}},
        {"UnlockingByMode", 7, 7, kLocked, {"unlock", "-r", "@tree"}, {"@tree"}},
        {"UnlockingByRecord", 2, 2, kEaFiles, {"unlock", "-r", "@tree"}, {"@tree"}},
        {"SettingAnAttribute",
         1,
         1,
         kEaFiles,
         {"set", "@tree/a.txt", "user.new", "value"},
         {"@tree"}},
        {"SettingAnAttributeOverAnEarlierLayout",
         1,
         1,
         kEaFiles,
         {"set", "@tree/b.txt", "user.new", "value"},
         {"@tree"}},
        {"SettingAForkOverAnEarlierLayout",
         1,
         1,
         kEaFiles,
         {"set", "@tree/b.txt", "com.apple.ResourceFork", "fork"},
         {"@tree"}},
        {"SettingFinderInfoInARecord",
         2,
         2,
         kEaFiles,
         {"set", "@tree/a.txt", "com.apple.FinderInfo", "--hex", std::string(64, '7')},
         {"@tree"}},
        {"SettingInfo",
         1,
         1,
         kEaFiles,
         {"set-info", "@tree/a.txt", "--label", "red", "--comment", "text", "--tags", "a:blue"},
         {"@tree"}},
        {"SettingInfoInARecord",
         2,
         2,
         kEaFiles,
         {"set-info", "@tree/a.txt", "--type", "ABCD", "--comment", "text"},
         {"@tree"}},
        {"SettingInfoInAnAppleDoubleFile",
         0,
         0,
         kAppleDoubleFiles,
         {"set-info", "@tree/a.txt", "--type", "ABCD", "--tags", "a:blue"},
         {"@tree"}},
        {"SettingAnAppleDoubleFilesAttribute",
         0,
         0,
         kAppleDoubleFiles,
         {"set", "@tree/a.txt", "user.new", "value"},
         {"@tree"}},
        {"SettingARealAttribute", 7, 7, 0, {"set", "@tree/a.txt", "user.new", "value"}, {"@tree"}},
        {"RemovingAnAttribute",
         1,
         1,
         kEaFiles,
         {"remove", "@tree/a.txt", "user.colour"},
         {"@tree"}},
        {"RemovingAnAppleDoubleFilesAttribute",
         0,
         0,
         kAppleDoubleFiles,
         {"remove", "@tree/a.txt", "user.colour"},
         {"@tree"}},
        {"Importing",
         1,
         1,
         kEaFiles | kIncoming,
         {"import", "@tree/incoming", "@tree/a.txt"},
         {"@tree"}},
        {"Restoring", 1, 1, kEaFiles | kText, {"restore", "--directory", "@", "@text"}, {"@text"}},
        {"RestoringToAppleDoubleFiles",
         0,
         0,
         kAppleDoubleFiles | kText,
         {"restore", "--directory", "@", "@text"},
         {"@text"}},
        {"RestoringToAttributes", 7, 7, kText, {"restore", "--directory", "@", "@text"}, {"@text"}},
        {"ImportingToAnAppleDoubleFile",
         0,
         0,
         kAppleDoubleFiles | kIncoming,
         {"import", "@tree/incoming", "@tree/sub/d.txt"},
         {"@tree", "@tree/sub"}},
        {"ImportingDataOverAFile",
         1,
         1,
         kEaFiles | kSingle,
         {"import", "--data", "@tree/single", "@tree/a.txt"},
         {"@tree"}},
        {"ImportingDataIntoANewFile",
         0,
         0,
         kAppleDoubleFiles | kSingle,
         {"import", "@tree/single", "@tree/new"},
         {"@tree"}},
        {"ImportingATree", 1, 1, kEaFiles | kArchived, {"import", "-r", "@tree"}, {"@tree"}},
        {"ImportingATreeToAppleDoubleFiles",
         0,
         0,
         kAppleDoubleFiles | kArchived,
         {"import", "-r", "@tree"},
         {"@tree"}},
        {"ImportingATreeToAttributes", 7, 7, kArchived, {"import", "-r", "@tree"}, {"@tree"}},
        {"Exporting", 1, 1, kEaFiles, {"export", "@tree/a.txt", "%exported"}, {"@tree"}},
        {"ExportingOverAFile",
         1,
         1,
         kEaFiles | kThere,
         {"export", "--force", "@tree/a.txt", "%tree/a.txt"},
         {"@tree", "%tree"}},
        {"ExportingWithData",
         0,
         0,
         kAppleDoubleFiles,
         {"export", "--format", "applesingle", "@tree/a.txt", "%exported"},
         {"@tree"}},
        {"ExportingToText",
         0,
         0,
         kAppleDoubleFiles,
         {"export", "--format", "binhex", "@tree/a.txt", "%exported"},
         {"@tree"}},
    };
    std::vector<Work> some;
    for (const Work& work : all) {
        const std::vector<int> types = Types({work.from, work.to});
        if (types.size() == 2) some.push_back(work);
    }
    return some;
}

class AttackerTest : public ::testing::TestWithParam<Work> {
 protected:
    void SetUp() override {
        const std::string why_not = WhyNoAttacker();
        if (!why_not.empty()) GTEST_SKIP() << why_not;
        const Work& work = GetParam();
        share_ = std::make_unique<HostileShare>(work.from, work.to, work.parts, work.two_volumes);
        arguments_ = share_->WithVolumes(Placed(work.arguments));
        for (const std::string& path : Placed(work.named)) named_.insert(path);
    }

    Arguments Placed(Arguments arguments) const {
        for (std::string& argument : arguments) {
            if (argument.starts_with('@')) argument = share_->From(argument.substr(1));
            if (argument.starts_with('%')) argument = share_->To(argument.substr(1));
        }
        return arguments;
    }

    // Fails the test where a run did damage; whether it did.
    bool ExpectNoDamage(const ToolResult& run, const std::string& attack) const {
        const std::string damage = share_->Damage(run);
        // Nobody interrupts it: a signal that ends it is its own. Sanitizers end it by their
        // report.
        const bool crashed = run.status >= 128 || run.err.find("Sanitizer") != std::string::npos ||
                             run.err.find("runtime error") != std::string::npos;
        EXPECT_TRUE(damage.empty()) << attack << ":\n" << damage << run.err;
        EXPECT_FALSE(crashed) << attack << ": exit status " << run.status << '\n' << run.err;
        return !damage.empty() || crashed;
    }

    // A first run with nobody in the way, which has to do what it is for. All that is there before
    // or after it is a place to attack.
    void WorkUndisturbed(const std::function<ToolResult()>& work) {
        share_->Renew();
        AddPlaces();
        const Descriptions before = share_->DescribeVolumes();
        const ToolResult result = work();
        ASSERT_FALSE(ExpectNoDamage(result, "nothing"));
        ASSERT_EQ(GetParam().only_looks, ChangesBetween(before, share_->DescribeVolumes()).empty())
            << ::testing::PrintToString(result);
        AddPlaces();
    }

    void AddPlaces() {
        for (const std::string& path : share_->Entries()) {
            if (!named_.contains(path)) places_.insert(path);
        }
    }

    bool IsDirectory(const std::string& place) const { return Exists(share_->Twin(place) + "/."); }

    std::unique_ptr<HostileShare> share_;
    Arguments arguments_;
    std::set<std::string> named_;
    std::set<std::string> places_;
};
INSTANTIATE_TEST_SUITE_P(AllWork, AttackerTest, ::testing::ValuesIn(AllWork()),
                         [](const auto& tested) { return tested.param.name; });

// ---- At each call -------------------------------------------------------------------------------

class StoppedAttackerTest : public AttackerTest {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_STOPPED();
        AttackerTest::SetUp();
        if (IsSkipped()) return;
        WorkUndisturbed([this] {
            return RunStopped(arguments_, share_->root(), [this](const FileCall& call) {
                calls_.push_back(call);
                return true;
            });
        });
    }

    // Whether the path is none of those that are there before or after, nor named.
    bool IsTemporary(const std::string& path) const {
        return share_->IsOnIt(path) && !places_.contains(path) && !named_.contains(path);
    }

    // The time-th call that sees such a place, from 1, finds a link to `target` there, which stays
    // or is gone after that call. Whether there was no damage.
    bool Attack(int time, const std::function<std::string(const FileCall&)>& place,
                const std::function<std::string(const std::string&)>& target, bool stays) {
        share_->Renew();
        std::string attack;
        std::string path;
        bool there = false;
        const StoppedRun run = RunStopped(arguments_, share_->root(), [&](const FileCall& call) {
            if (there) {
                share_->SwapBack(path);
                return false;
            }
            std::string here = place(call);
            if (here.empty() || --time != 0) return true;
            path = std::move(here);
            there = share_->Swap(path, target(path)) && !stays;
            attack = path + " became a link" + (stays ? "" : " for a moment") + " before " +
                     ::testing::PrintToString(call);
            return there;
        });
        ++attacks_;
        return !ExpectNoDamage(run, attack);
    }

    // Where a run takes long, one time of so many.
    static int Thinning() {
        return static_cast<int>(Tested().sanitized() ? std::size_t{kEmulatedSeriesStep}
                                                     : SeriesStep());
    }

    // About `most` of some times, other ones at each call.
    std::vector<int> SomeOf(const std::vector<int>& times, int most) {
        const std::size_t step =
            std::max<std::size_t>(times.size() / static_cast<std::size_t>(most), 1) *
            static_cast<std::size_t>(Thinning());
        std::vector<int> some;
        for (std::size_t i = turn_++ % step; i < times.size(); i += step) some.push_back(times[i]);
        return some;
    }

    // Times that a call sees such a place.
    struct Times {
        std::vector<int> doing;
        std::vector<int> looking;
    };
    Times TimesOf(const std::function<std::string(const FileCall&)>& place) const {
        Times times;
        int time = 0;
        for (const FileCall& call : calls_) {
            if (place(call).empty()) continue;
            (call.OnlyLooks() ? times.looking : times.doing).push_back(++time);
        }
        return times;
    }

    // Many calls only look what is there, and of those the first is enough: a link that comes
    // before another is there for what is done next as well, and is noticed.
    void AttackAt(const Times& times, const std::function<std::string(const FileCall&)>& place,
                  const std::function<std::string(const std::string&)>& target, bool stays) {
        std::vector<int> all = SomeOf(times.doing, kMostOfDoing);
        if (stays && !times.looking.empty() && Thinning() == 1) {
            all.push_back(times.looking.front());
        }
        for (const int time : all) {
            if (!Attack(time, place, target, stays)) return;
        }
    }

    // Before every other call that does something the link stays, and before the others it goes.
    void AttackPlaces(bool stays) {
        std::size_t count = stays ? 0 : 1;
        for (const std::string& path : places_) {
            const auto place = [&path](const FileCall& call) {
                return call.Sees(path) ? path : std::string();
            };
            Times times = TimesOf(place);
            std::erase_if(times.doing, [&count](int /*time*/) { return ++count % 2 == 0; });
            AttackAt(
                times, place, [this](const std::string& at) { return share_->Twin(at); }, stays);
        }
        EXPECT_TRUE(attacks_ > 0 || !stays || Thinning() > 1);
    }

    // How often one place is attacked at most, about.
    static constexpr int kMostOfDoing = 16;

    std::vector<FileCall> calls_;  // of the undisturbed run
    std::size_t turn_ = 0;
    int attacks_ = 0;
};
INSTANTIATE_TEST_SUITE_P(AllWork, StoppedAttackerTest, ::testing::ValuesIn(AllWork()),
                         [](const auto& tested) { return tested.param.name; });

TEST_P(StoppedAttackerTest, LinksInPlaceOfWhatIsOrWillBeThereLeadNobodyOut) { AttackPlaces(true); }

TEST_P(StoppedAttackerTest, LinksThatAreThereForOneCallLeadNobodyOut) { AttackPlaces(false); }

TEST_P(StoppedAttackerTest, LinksInPlaceOfOtherNamesThatItLooksUpLeadNobodyOut) {
    const auto place = [this](const FileCall& call) {
        for (const FileCall::LookUp& look_up : call.look_ups) {
            if (IsTemporary(look_up.path)) return look_up.path;
        }
        return std::string();
    };
    for (const bool directory : {false, true}) {
        AttackAt(
            TimesOf(place), place,
            [this, directory](const std::string& path) { return share_->Twin(path, directory); },
            true);
    }
}

// The kernel is asked for a list or a value twice, for its size and for itself.
TEST_P(StoppedAttackerTest, AttributesThatComeAndGoWhileTheyAreReadDoNoDamage) {
    const auto reads = [](const FileCall& call) { return call.name.ends_with("xattr"); };
    std::vector<int> times(
        static_cast<std::size_t>(std::count_if(calls_.begin(), calls_.end(), reads)));
    std::iota(times.begin(), times.end(), 1);
    for (const bool go : {true, false}) {
        for (const int time : SomeOf(times, kMostOfDoing)) {
            share_->Renew();
            int left = time;
            std::string attack;
            const StoppedRun run =
                RunStopped(arguments_, share_->root(), [&](const FileCall& call) {
                    if (!reads(call) || --left != 0) return true;
                    attack = std::string("attributes ") + (go ? "went" : "came") + " before " +
                             ::testing::PrintToString(call);
                    share_->ChangeAttributes(go);
                    return false;
                });
            if (ExpectNoDamage(run, attack)) return;
        }
    }
}

// ---- At any time --------------------------------------------------------------------------------

// A process that exchanges places on the share for links, over and over, until the end of its
// scope.
class Exchanger {
 public:
    Exchanger(const HostileShare& share, const std::vector<std::string>& places) {
        std::vector<std::pair<std::string, std::string>> pairs;
        for (const std::string& path : places) {
            pairs.emplace_back(path, share.PrepareLink(path, static_cast<int>(pairs.size())));
        }
        int ready[2];
        if (pipe(ready) != 0) abort();
        process_ = fork();
        if (process_ < 0) abort();
        if (process_ == 0) {
            if (setresgid(kAttackersGroup, kAttackersGroup, kAttackersGroup) != 0 ||
                setresuid(kAttacker, kAttacker, kAttacker) != 0 || write(ready[1], "", 1) != 1) {
                _exit(1);
            }
            for (;;) {
                for (const auto& [path, link] : pairs) {
                    (void)renameat2(AT_FDCWD, path.c_str(), AT_FDCWD, link.c_str(),
                                    RENAME_EXCHANGE);
                }
            }
        }
        close(ready[1]);
        char c;
        EXPECT_EQ(1, read(ready[0], &c, 1));
        close(ready[0]);
    }
    ~Exchanger() {
        kill(process_, SIGKILL);
        waitpid(process_, nullptr, 0);
    }
    Exchanger(const Exchanger&) = delete;
    Exchanger& operator=(const Exchanger&) = delete;

 private:
    pid_t process_;
};

TEST_P(AttackerTest, LinksThatComeAndGoAllTheTimeLeadNobodyOut) {
    WorkUndisturbed([this] { return RunTool(arguments_); });
    if (HasFatalFailure()) return;
    const std::vector<std::string> all(places_.begin(), places_.end());
    std::vector<std::string> directories;
    std::copy_if(all.begin(), all.end(), std::back_inserter(directories),
                 [this](const std::string& place) { return IsDirectory(place); });
    const int rounds = Tested().emulated() || Tested().sanitized() ? 3 : 20;
    for (int round = 0; round < rounds; ++round) {
        share_->Renew();
        std::optional<Exchanger> exchanger(std::in_place, *share_,
                                           round % 2 == 0 ? directories : all);
        const ToolResult result = RunTool(arguments_);
        exchanger.reset();
        if (ExpectNoDamage(result, "round " + std::to_string(round))) return;
    }
}

}  // namespace
}  // namespace mavoea::test

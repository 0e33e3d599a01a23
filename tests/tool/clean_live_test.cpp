// mavoea clean beside others who rename: what looks dangling for a moment is not taken for it.

#include <pty.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/wait.h>

#include <random>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/stopped_tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr char kStreamEnd[] = "@MavoEAStream";

// ---- Between two calls --------------------------------------------------------------------------

// A directory with an object, and metadata of another that is gone.
class CleanLiveTest : public ::testing::Test {
 protected:
    void SetUp() override { MAVOEA_SKIP_UNLESS_STOPPED(); }

    std::string share() const { return dir_ / "share"; }
    std::string At(const std::string& name) const { return share() + '/' + name; }
    std::string Stream(const std::string& name) const { return At("@eaDir/" + name + kStreamEnd); }

    void Make() const {
        std::filesystem::remove_all(share());
        MakeDir(share());
        MakeDir(At("@eaDir"));
        WriteFile(At("stays"), {});
        WriteFile(Stream("stays"), Ascii("of the one that stays"));
        WriteFile(Stream("x"), Ascii("of x"));
        WriteFile(At("@eaDir/x@MavoResource"), Ascii("resource of x"));
    }

    // The first look and the second are at once behind each other.
    Arguments Clean() const { return {"clean", "--yes", "--wait", "0", share()}; }

    // `event` comes before each call of a run, one run for each.
    void AtEachCall(const std::function<void(const FileCall&)>& event,
                    const std::function<void()>& check) const {
        int calls = 0;
        for (int nth = 1; nth == 1 || nth <= calls; ++nth) {
            Make();
            std::string where;
            const StoppedRun run = RunStopped(Clean(), share(), [&](const FileCall& call) {
                calls = std::max(calls, call.nth);
                if (call.nth == 1) found_ = false;
                if (call.nth != nth) {
                    for (const FileCall::LookUp& look_up : call.look_ups) {
                        if (call.nth < nth && look_up.path == Stream("x")) found_ = true;
                    }
                    return true;
                }
                where = ::testing::PrintToString(call);
                event(call);
                return true;
            });
            SCOPED_TRACE(where);
            EXPECT_EQ(0, run.status) << run.err;
            if (where.empty()) break;  // it had fewer calls than the longest
            check();
            if (HasFailure()) return;
        }
        EXPECT_LT(20, calls);
    }

    TempDir dir_{FastDirectory()};
    mutable bool found_ = false;  // the metadata of "x" by the run, before the event
};

TEST_F(CleanLiveTest, MetadataThatFollowsItsObjectIsNotTaken) {
    bool followed = false;
    AtEachCall(
        [&](const FileCall&) {
            WriteFile(At("y"), Ascii("data of x, under its new name"));
            followed = rename(Stream("x").c_str(), Stream("y").c_str()) == 0;
        },
        [&] {
            if (!followed) return;
            EXPECT_EQ(Ascii("of x"), BytesIn(Stream("y")));
        });
}

TEST_F(CleanLiveTest, MetadataThatIsPutInThePlaceOfADanglingFileIsNotTaken) {
    AtEachCall(
        [&](const FileCall&) {
            WriteFile(At("new"), Ascii("of the new x"));
            ASSERT_EQ(0, rename(At("new").c_str(), Stream("x").c_str()));
            WriteFile(At("x"), Ascii("data of the new x"));
        },
        [&] { EXPECT_EQ(Ascii("of the new x"), BytesIn(Stream("x"))); });
}

TEST_F(CleanLiveTest, MetadataThatComesBeforeItsObjectIsNotTakenForWhatWasFound) {
    AtEachCall(
        [&](const FileCall&) {
            WriteFile(At("new"), Ascii("of the new x"));
            ASSERT_EQ(0, rename(At("new").c_str(), Stream("x").c_str()));
        },
        [&] {
            if (!found_) return;
            EXPECT_EQ(Ascii("of the new x"), BytesIn(Stream("x")));
        });
}

// Only the last call itself comes too late: nothing tells of what comes before it.
TEST_F(CleanLiveTest, MetadataWhoseObjectComesIsGivenBack) {
    bool late = false;
    bool there = false;
    AtEachCall(
        [&](const FileCall& call) {
            there = Exists(Stream("x"));
            late = call.name.starts_with("unlink");
            for (const std::string& path : Tree(share())) {
                if (path.ends_with("/x@MavoEAStream")) there = true;
            }
            WriteFile(At("x"), Ascii("data"));
        },
        [&] {
            if (!there || late) return;
            EXPECT_TRUE(Exists(Stream("x")));
        });
}

// Promise: "The tool: `clean`"
TEST_F(CleanLiveTest, ARunThatIsKilledTakesNothingThatItWouldNotHaveTaken) {
    Make();
    ASSERT_THAT(RunTool(Clean()), Succeeded());
    const auto cleaned = Tree(share());
    bool killed = true;
    for (int nth = 1; killed && !HasFailure(); ++nth) {
        SCOPED_TRACE(nth);
        for (const bool comes : {false, true}) {
            Make();
            killed = RunKilledAt(Clean(), share(), nth).status == 128 + SIGKILL;
            bool there = false;
            for (const std::string& path : Tree(share())) {
                if (path.ends_with("/x@MavoEAStream")) there = true;
            }
            if (comes) WriteFile(At("x"), Ascii("data"));
            EXPECT_THAT(RunTool(Clean()), Succeeded());
            if (comes) {
                EXPECT_EQ(there, Exists(Stream("x")));
            } else {
                EXPECT_EQ(cleaned, Tree(share()));
            }
        }
    }
}

// Promise: "The tool: Where something is replaced"
// Promise: "The tool: all |"
// Promise: "What may be left over: `@eaDir/.mavoea-`"
TEST_F(CleanLiveTest, TemporaryFilesGoThatNobodyWorksWith) {
    Make();
    for (const std::string& name :
         {At(".mavoea-left0ver"), At("@eaDir/.mavoea-left1ver"), At(".mavoea-working0"),
          At(".mavoea-toolongs"), At(".mavoea-UPPERCAS"), At(".mavoea-not8")}) {
        WriteFile(name, Ascii("half of"));
    }
    const int fd = open(At(".mavoea-working0").c_str(), O_RDWR | O_CLOEXEC);
    ASSERT_EQ(0, flock(fd, LOCK_EX));
    const ToolResult result = RunTool(Clean());
    EXPECT_THAT(result, Succeeded());
    EXPECT_THAT(result.out, HasSubstr(At(".mavoea-left0ver") +
                                      ": temporary file, a run of mavoea was cut short; removed"));
    EXPECT_FALSE(Exists(At(".mavoea-left0ver")));
    EXPECT_FALSE(Exists(At("@eaDir/.mavoea-left1ver")));
    EXPECT_FALSE(Exists(At(".mavoea-toolongs")));
    for (const std::string& name :
         {At(".mavoea-working0"), At(".mavoea-UPPERCAS"), At(".mavoea-not8")}) {
        EXPECT_TRUE(Exists(name)) << name;
    }
    close(fd);
}

// ---- Waiting ------------------------------------------------------------------------------------

TEST_F(CleanLiveTest, TheWaitIsCountedDownOnATerminalAndEndsWithAnInterrupt) {
    Make();
    const auto before = Tree(share());
    int terminal = -1;
    int line = -1;
    ASSERT_EQ(0, openpty(&terminal, &line, nullptr, nullptr, nullptr));
    ToolStart tool({"clean", "--yes", "--wait", "3600", share()});
    const pid_t child = fork();
    ASSERT_LE(0, child);
    if (child == 0) {
        alarm(60);
        dup2(line, 2);
        dup2(open("/dev/null", O_WRONLY), 1);
        close(terminal);
        close(line);
        tool.Exec();
        _exit(127);
    }
    close(line);
    std::string said;
    char c = 0;
    while (said.find(" found") == std::string::npos && read(terminal, &c, 1) == 1) said += c;
    EXPECT_THAT(said, HasSubstr("looking again in 3600 s, 2 found"));
    kill(child, SIGINT);
    while (read(terminal, &c, 1) == 1) said += c;
    int status = 0;
    ASSERT_EQ(child, waitpid(child, &status, 0));
    EXPECT_EQ(128 + SIGINT, WEXITSTATUS(status));
    EXPECT_THAT(said, HasSubstr("interrupted: what is left is as it was"));
    EXPECT_EQ(before, Tree(share()));
    close(terminal);
}

TEST_F(CleanLiveTest, NobodyWaitsWhereNothingIsToBeRemoved) {
    Make();
    WithoutWaiting([&] {
        EXPECT_THAT(RunTool({"clean", "--wait", "3600", share()}), Succeeded());
        EXPECT_THAT(RunTool({"clean", "--yes", "--wait", "0", share()}), Succeeded());
        EXPECT_THAT(RunTool({"clean", "--yes", "--wait", "3600", share()}), Succeeded());
    });
    EXPECT_NE(0, RunTool({"clean", "--wait", "-1", share()}).status);
}

// ---- All the time -------------------------------------------------------------------------------

// A process that works until the end of its scope.
class Beside {
 public:
    explicit Beside(const std::function<int()>& work) {
        fflush(nullptr);
        process_ = fork();
        if (process_ < 0) abort();
        if (process_ == 0) _exit(work());
    }
    ~Beside() {
        if (process_ <= 0) return;
        kill(process_, SIGKILL);
        waitpid(process_, nullptr, 0);
    }
    Beside(const Beside&) = delete;
    Beside& operator=(const Beside&) = delete;

    // The exit status.
    int Wait() {
        int status = 0;
        if (waitpid(process_, &status, 0) != process_) abort();
        process_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }

 private:
    pid_t process_;
};

class CleanBesideRenamesTest : public ::testing::Test {
 protected:
    static constexpr int kRenames = 5000;  // of each kind
    static constexpr int kObjects = 50;

    void SetUp() override { MAVOEA_SKIP_UNLESS_ROOT(); }

    static std::string NameOf(int i) { return "object " + std::to_string(i); }
    static Bytes StreamOf(int i) {
        return StreamImage{.attributes = {{Colour(), Ascii(std::to_string(i))}}}.Build();
    }
    static Bytes ResourceOf(int i) {
        return PlainAppleDouble(Pattern(32, 0x40), Ascii("fork of " + std::to_string(i)));
    }

    static void MakeObjects(const std::string& directory) {
        MakeDir(directory);
        for (int i = 0; i < kObjects; ++i) {
            const std::string object = directory + '/' + NameOf(i);
            WriteFile(object, Ascii("data of " + std::to_string(i)));
            PutStream(object, StreamOf(i));
            PutResource(object, ResourceOf(i));
        }
    }
    static void ExpectObjects(const std::string& directory) {
        for (int i = 0; i < kObjects; ++i) {
            SCOPED_TRACE(directory + '/' + NameOf(i));
            const MetadataPaths paths(directory + '/' + NameOf(i));
            EXPECT_EQ(Ascii("data of " + std::to_string(i)), BytesIn(directory + '/' + NameOf(i)));
            EXPECT_EQ(StreamOf(i), BytesIn(paths.stream));
            EXPECT_EQ(ResourceOf(i), BytesIn(paths.resource));
        }
    }

    // From one directory to the other and back, an object and then its metadata, or that first. Now
    // and then it takes its time between the two.
    static int RenameAsServicesDo(const std::string& one, const std::string& other, int renames) {
        std::minstd_rand random(1);
        for (int i = 0; i < renames; ++i) {
            const bool back = i / kObjects % 2 == 1;
            const std::string from = (back ? other : one) + '/';
            const std::string to = (back ? one : other) + '/';
            const std::string name = NameOf(i % kObjects);
            std::vector<std::string> steps = {name, "@eaDir/" + name + "@MavoEAStream",
                                              "@eaDir/" + name + "@MavoResource"};
            if (random() % 4 == 0) std::swap(steps.front(), steps.back());
            for (const std::string& step : steps) {
                if (rename((from + step).c_str(), (to + step).c_str()) != 0) return 1;
                if (random() % 16 == 0) usleep(20000);
            }
        }
        return 0;
    }

    TempDir dir_{FastDirectory()};
};

TEST_F(CleanBesideRenamesTest, TenThousandRenamesLoseNothing) {
    const std::string root = dir_ / "share";
    MakeDir(root);
    const int renames = kRenames / static_cast<int>(SeriesStep()) / (2 * kObjects) * 2 * kObjects;
    for (const char* name : {"/service", "/mv"}) {
        MakeObjects(root + name);
        for (const char* end : {"", " elsewhere"}) {
            MakeDir(root + name + end);
            WriteFile(root + name + end + "/stays", {});
            PutStream(root + name + end + "/stays", StreamOf(-1));
            // So that there is something to be found, and to be waited for, in each round.
            PutStream(root + name + end + "/gone", StreamOf(-2));
        }
    }
    const std::string done = dir_ / "done";
    Beside cleaner([&] {
        int rounds = 0;
        while (!Exists(done) || rounds < 3) {
            const ToolResult result =
                RunTool({"--volume", root + "=1", "clean", "-r", "--yes", root});
            if (result.status != 0) {
                WriteFile(dir_ / "failed", Ascii(result.err));
                return 1;
            }
            PutStream(root + "/mv/gone", StreamOf(-2));
            ++rounds;
        }
        return 0;
    });
    Beside service([&] {
        return RenameAsServicesDo(root + "/service", root + "/service elsewhere", renames);
    });
    for (int i = 0; i < renames; i += kObjects) {
        const bool back = i / kObjects % 2 == 1;
        Arguments arguments = {"--volume", root + "=1", "mv"};
        for (int object = 0; object < kObjects; ++object) {
            arguments.push_back(root + (back ? "/mv elsewhere/" : "/mv/") + NameOf(object));
        }
        arguments.push_back(root + (back ? "/mv" : "/mv elsewhere"));
        const ToolResult result = RunTool(arguments);
        ASSERT_EQ(0, result.status) << result.err;
    }
    EXPECT_EQ(0, service.Wait());
    WriteFile(done, {});
    EXPECT_EQ(0, cleaner.Wait()) << TextOf(dir_ / "failed");
    ExpectObjects(root + "/service");
    ExpectObjects(root + "/mv");
    EXPECT_FALSE(Exists(root + "/service/@eaDir/gone@MavoEAStream")) << "nothing was removed";
}

}  // namespace
}  // namespace mavoea::test

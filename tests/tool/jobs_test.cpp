// Objects that several processes look at: what is said, counted and returned is what one of them
// says, in the order in which it does, whatever becomes of the processes.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>

#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::SizeIs;

constexpr int kAppleDouble = 0;

class JobsTest : public ::testing::Test {
 protected:
    std::string At(const std::string& name) const { return share_.path() + '/' + name; }

    // A file with an attribute, of a value that is its path or, with `damaged`, cut short.
    void Make(const std::string& name, bool damaged = false) const {
        const fs::path path(At(name));
        fs::create_directories(path.parent_path());
        WriteFile(path, Ascii("data"));
        Bytes stream = StreamImage{.attributes = {{"user.k", Ascii(name)}}}.Build();
        if (damaged) stream.resize(stream.size() - 1);
        WriteFile(path.parent_path() / ("._" + path.filename().string()), stream);
    }

    // A large directory, a deep narrow tree, many small ones, damage in each; what cannot be
    // entered.
    void MakeTree() const {
        for (int i = 0; i < 400; ++i) Make("tree/large/" + std::to_string(i), i % 97 == 0);
        std::string deep = "tree/deep";
        for (int i = 0; i < 80; ++i) Make((deep += "/d") + "/f", i % 61 == 0);
        for (int i = 0; i < 150; ++i) Make("tree/small" + std::to_string(i) + "/f", i % 89 == 0);
    }

    ToolResult RunWith(unsigned jobs, Arguments arguments) const {
        arguments.insert(arguments.begin() + 1, {"--jobs", std::to_string(jobs)});
        return share_.Run(arguments);
    }

    // As one process does it.
    void ExpectSame(const Arguments& arguments, int status) const {
        const ToolResult one = RunWith(1, arguments);
        EXPECT_EQ(status, one.status);
        for (const unsigned jobs : {2U, 5U}) {
            const ToolResult more = RunWith(jobs, arguments);
            EXPECT_EQ(one.status, more.status);
            EXPECT_EQ(one.out, more.out);
            EXPECT_EQ(one.err, more.err);
        }
    }

    const Volume share_{kAppleDouble};
};

std::set<pid_t> ChildrenOf(pid_t process) {
    const std::string id = std::to_string(process);
    std::ifstream file("/proc/" + id + "/task/" + id + "/children");
    std::set<pid_t> children;
    for (pid_t child = 0; file >> child;) children.insert(child);
    return children;
}

std::vector<std::string> LinesOf(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

// The objects of a list.
std::vector<std::string> Headings(const std::string& text) {
    std::vector<std::string> headings;
    for (const std::string& line : LinesOf(text)) {
        if (line.starts_with('/')) headings.push_back(line);
    }
    return headings;
}

TEST_F(JobsTest, AllIsAsOneProcessDoesIt) {
    MakeTree();
    const std::string tree = At("tree");
    const std::string none = At("tree/none");
    const struct {
        Arguments arguments;
        int status;
    } cases[] = {
        {{"list", "-r", tree}, 2},
        {{"list", "-l", "-r", tree}, 2},
        {{"list", "-0", "-r", tree}, 2},
        {{"list", "--json", "--values", "-r", tree}, 2},
        {{"list", "-r", "--shard", "2/3", tree}, 2},
        {{"list", "-r", none, tree, At("tree/deep"), At("tree/large/7")}, 2},
        {{"list", At("tree/large/1"), none, At("tree/large/2")}, 1},
        {{"show", "-r", tree}, 2},
        {{"show", "--json", "-r", tree}, 2},
        {{"check", "-r", tree}, 1},
        {{"check", "-v", "-r", tree}, 1},
        {{"check", "--json", "-r", tree}, 1},
        {{"check", "-r", none, tree, none}, 2},
        {{"check", At("tree/large/0"), At("tree/large/1")}, 1},
    };
    for (const auto& [arguments, status] : cases) {
        SCOPED_TRACE(arguments[0] + ' ' + arguments[1]);
        ExpectSame(arguments, status);
    }
}

// Not one of which holds more than a few of what it is for.
TEST_F(JobsTest, AListOfPathsIsAnsweredBeforeMoreOfItIsWaitedFor) {
    Make("one");
    Make("two");
    Arguments arguments = {"--volume", share_.path() + "=0", "list", "-j", "2", "--files0-from=-"};
    RunningTool tool(arguments, RunningTool::Output::kSaid);
    tool.Answer(At("one") + '\0');
    ASSERT_TRUE(tool.WaitFor(At("one") + ":\nuser.k\n"));
    tool.Answer(At("two") + '\0');
    ASSERT_TRUE(tool.WaitFor(At("two") + ":\nuser.k\n"));
    tool.EndInput();
    EXPECT_EQ(0, tool.Wait());
}

// Of which more is found than there is room for at a time, behind what takes long.
TEST_F(JobsTest, ValuesOfAnySizeComeInTheirOrder) {
    for (int i = 0; i < 8; ++i) {
        const std::string path = At("f" + std::to_string(i));
        WriteFile(path, Ascii("data"));
        const Bytes value(std::size_t{3} << 20, static_cast<std::uint8_t>('a' + i));
        WriteFile(At("._f" + std::to_string(i)),
                  StreamImage{.attributes = {{"user.k", value}}}.Build());
    }
    ExpectSame({"list", "--json", "--values", "-r", share_.path()}, 0);
}

// Its errands are done by others; the one that it had in hand, if any, has failed.
TEST_F(JobsTest, AProcessThatDiesIsOneFailureAndTheRestIsDone) {
    constexpr int kTries = 200;
    for (int i = 0; i < 1000; ++i) Make("tree/" + std::to_string(i));
    const std::string tree = At("tree");
    const std::vector<std::string> all = Headings(RunWith(1, {"list", "-r", tree}).out);
    int failures = 0;
    for (int i = 0; i < kTries && failures < 12; ++i) {
        ToolStart tool({"--volume", share_.path() + "=0", "list", "-j", "2", "-r", tree});
        int out[2];
        int err[2];
        ASSERT_EQ(0, pipe(out));
        ASSERT_EQ(0, pipe(err));
        const pid_t process = fork();
        if (process == 0) {
            alarm(60);
            dup2(out[1], 1);
            dup2(err[1], 2);
            for (const int fd : {out[0], out[1], err[0], err[1]}) close(fd);
            tool.Exec();
            _exit(127);
        }
        close(out[1]);
        close(err[1]);
        std::string said;
        char part[4096];
        const auto hear = [&](int from, std::string* text) {
            const ssize_t size = read(from, part, sizeof part);
            if (size > 0) text->append(part, static_cast<std::size_t>(size));
            return size > 0;
        };
        ASSERT_TRUE(hear(out[0], &said));
        const std::set<pid_t> workers = ChildrenOf(process);
        if (!workers.empty()) kill(*workers.begin(), SIGKILL);
        while (hear(out[0], &said)) continue;
        std::string complained;
        while (hear(err[0], &complained)) continue;
        close(out[0]);
        close(err[0]);
        int status = 0;
        ASSERT_EQ(process, waitpid(process, &status, 0));
        ASSERT_TRUE(WIFEXITED(status));
        const std::vector<std::string> lines = LinesOf(complained);
        const auto died = std::count_if(lines.begin(), lines.end(), [](const std::string& line) {
            return line.find(
                       "the process that worked on it has died: signal 9 (Killed); give the "
                       "command again") != std::string::npos;
        });
        ASSERT_LE(died, 1);
        EXPECT_EQ(died, static_cast<std::ptrdiff_t>(lines.size()));
        EXPECT_EQ(died == 1 ? 2 : 0, WEXITSTATUS(status));
        failures += static_cast<int>(died);
        const std::vector<std::string> named = Headings(said);
        EXPECT_LE(all.size() - static_cast<std::size_t>(died), named.size());
        auto next = all.begin();
        for (const std::string& name : named) {
            next = std::find(next, all.end(), name);
            ASSERT_NE(all.end(), next) << name << " is not where it should be";
            ++next;
        }
    }
    EXPECT_LT(0, failures);
}

// As many processes as the user may have are running.
TEST_F(JobsTest, WithoutFurtherProcessesOneDoesEverything) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    if (Tested().sanitized() || Tested().emulated()) {
        GTEST_SKIP() << "what the tool runs in takes processes of its own";
    }
    for (int i = 0; i < 100; ++i) Make("tree/" + std::to_string(i));
    const ToolResult one = RunWith(1, {"list", "-r", At("tree")});
    fs::permissions(share_.path(), fs::perms::all);
    AsUser(4242, Root::kGivenUp, [&] {
        const rlimit limit = {1, 1};
        ASSERT_EQ(0, setrlimit(RLIMIT_NPROC, &limit));
        ToolStart tool({"--volume", share_.path() + "=0", "list", "-j", "4", "-r", At("tree")});
        ASSERT_NE(nullptr, freopen(At("out").c_str(), "w", stdout));
        tool.Exec();
    });
    EXPECT_EQ(one.out, TextOf(At("out")));
    EXPECT_THAT(Headings(one.out), SizeIs(100));
}

TEST_F(JobsTest, NumbersThatMeanNothingAreRefused) {
    Make("one");
    for (const char* number : {"0", "-1", "x", "257", ""}) {
        EXPECT_EQ(2, share_.Run({"list", "-j", number, At("one")}).status) << number;
    }
}

}  // namespace
}  // namespace mavoea::test

// How far long work has come, as it says it in lines that stay.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <thread>

#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::HasSubstr;
using ::testing::Not;

constexpr int kCount = 1500;

// The processes of the tool that count: those that have ended by themselves and wait for it to
// notice.
bool HasEndedChild(pid_t process) {
    const std::string id = std::to_string(process);
    std::ifstream children("/proc/" + id + "/task/" + id + "/children");
    for (std::string child; children >> child;) {
        std::ifstream file("/proc/" + child + "/stat");
        std::string stat;
        std::getline(file, stat);
        if (stat.find(") Z ") != std::string::npos) return true;
    }
    return false;
}

// What a run says on standard error, of which nothing is read until it has counted: it stops when
// the pipe is full.
std::vector<std::string> LinesOnceCounted(const Arguments& arguments) {
    int err[2];
    if (pipe(err) != 0) abort();
    (void)fcntl(err[1], F_SETPIPE_SZ, 4096);
    ToolStart tool(arguments);
    const pid_t process = fork();
    if (process == 0) {
        alarm(60);
        dup2(open("/dev/null", O_WRONLY), 1);
        dup2(err[1], 2);
        close(err[0]);
        close(err[1]);
        tool.Exec();
        _exit(127);
    }
    close(err[1]);
    while (!HasEndedChild(process)) {
        if (waitpid(process, nullptr, WNOHANG) != 0) {
            ADD_FAILURE() << "it has ended, and counted nothing";
            break;
        }
        std::this_thread::yield();
    }
    std::string said;
    char part[4096];
    for (ssize_t size = 0; (size = read(err[0], part, sizeof part)) > 0;) {
        said.append(part, static_cast<std::size_t>(size));
    }
    close(err[0]);
    (void)waitpid(process, nullptr, 0);
    std::istringstream stream(said);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

class ProgressTest : public ::testing::Test {
 protected:
    ProgressTest() {
        fs::create_directories(travel_.From("tree/inner"));
        for (int i = 0; i < kCount; ++i) {
            travel_.MakeFile(
                travel_.From((i % 2 == 0 ? "tree/" : "tree/inner/") + std::to_string(i)));
        }
        fs::create_symlink("0", travel_.From("tree/link"));
    }

    const Travel travel_{kEaDirectory, kEaDirectory};
};

TEST_F(ProgressTest, WorkOnATreeSaysOfHowManyObjects) {
    const auto lines = LinesOnceCounted(
        travel_.WithVolumes({"lock", "-r", "-j", "1", "--progress=0", travel_.From("tree")}));
    ASSERT_LE(2U, lines.size());
    // Each line comes before its object is done; links are left out.
    EXPECT_THAT(lines.front(), HasSubstr("locking: 0 done, 0 failed, 0.0/s, "));
    const std::regex last(
        "mavoea: locking: 1501 done, 0 failed, 99 % of 1502, 0 s left, "
        "[0-9.]+/s, .*/tree/[a-z0-9/]+");
    EXPECT_TRUE(std::regex_match(lines.back(), last)) << lines.back();
}

TEST_F(ProgressTest, AConversionCountsWhatItCopies) {
    const auto lines = LinesOnceCounted(
        travel_.WithVolumes({"convert", "-r", "-j", "1", "--to", "1", "--progress=0",
                             travel_.From("tree"), travel_.To("tree")}));
    const std::regex some(
        "mavoea: converting: 1[0-9]{3} converted, 0 compared, 0 failed, "
        "[0-9.]+ KiB, [0-9]+ % of 1503, 0 s left, [0-9.]+/s, .*");
    EXPECT_TRUE(std::any_of(lines.begin(), lines.end(), [&](const std::string& line) {
        return std::regex_match(line, some);
    })) << lines.back();
}

// Nobody counts what a list names while it may still be written.
TEST_F(ProgressTest, ListedPathsHaveNoTotal) {
    const ToolResult run = travel_.Run(
        {"lock", "-r", "-j", "1", "--progress=0", "--files0-from", "-"}, travel_.From("tree"));
    EXPECT_EQ(0, run.status);
    EXPECT_THAT(run.err, HasSubstr("1501 done"));
    EXPECT_THAT(run.err, Not(HasSubstr(" % of ")));
}

TEST_F(ProgressTest, AShardCountsItsOwn) {
    const auto lines = LinesOnceCounted(travel_.WithVolumes(
        {"lock", "-r", "-j", "1", "--progress=0", "--shard", "1/2", travel_.From("tree")}));
    const ToolResult listed =
        travel_.Run({"list", "-r", "--json", "--shard", "1/2", travel_.From("tree")});
    const auto count = std::count(listed.out.begin(), listed.out.end(), '\n');
    EXPECT_GT(kCount, count);
    EXPECT_THAT(lines.back(), HasSubstr(" % of " + std::to_string(count) + ", "));
}

}  // namespace
}  // namespace mavoea::test

// Two processes that make the same file at the same time. Whoever is told that it is done finds it
// done, and nobody removes or replaces what the other has written.

#include <errno.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <functional>
#include <optional>
#include <string>

#include "include/mavoea.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/second_volume.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

int Rounds() { return RaceRounds(5000); }

constexpr int kLocked = 0x400;

// What both processes know. They wait for each other before each step of a round.
struct Shared {
    std::atomic<int> waiting;
    std::atomic<int> steps;
    std::atomic<bool> trouble;
    int results[2];
    int codes[2];
};

// False once either of the two has come upon trouble.
bool Meet(Shared* shared) {
    const int step = shared->steps;
    if (++shared->waiting == 2) {
        shared->waiting = 0;
        ++shared->steps;
    } else {
        while (shared->steps == step && !shared->trouble) sched_yield();
    }
    return !shared->trouble;
}

struct Race {
    std::function<void()> prepare;
    std::function<int(int self)> call;
    // What is wrong with what the two calls have left; empty when nothing is.
    std::function<std::string(const Shared&)> fault;
};

void RunRounds(const Race& race, int self, Shared* shared) {
    const int rounds = Rounds();
    for (int round = 0; round < rounds; ++round) {
        if (self == 0) race.prepare();
        if (!Meet(shared)) return;
        (void)TakeRecords();
        shared->results[self] = race.call(self);
        shared->codes[self] = MLIBCErrGet();
        (void)TakeCallNames();
        (void)TakePlatformCalls();
        (void)TakeLog();
        if (!Meet(shared)) return;
        if (self != 0) continue;
        const std::string fault = race.fault(*shared);
        if (fault.empty()) continue;
        fprintf(stderr, "round %d: %s; results %d and %d, codes 0x%X and 0x%X\n", round,
                fault.c_str(), shared->results[0], shared->results[1],
                static_cast<unsigned>(shared->codes[0]), static_cast<unsigned>(shared->codes[1]));
        shared->trouble = true;
        return;
    }
}

// Any one is enough: both may be done, one after the other, and who is refused is told why.
std::string FaultOfResults(const Shared& shared) {
    if (shared.results[0] != 0 && shared.results[1] != 0) return "neither is done";
    for (int self = 0; self < 2; ++self) {
        if (shared.results[self] != 0 && shared.codes[self] != kLocked) return "another failure";
    }
    return "";
}

class MadeFilesTest : public ::testing::TestWithParam<bool>, protected Identity {
 protected:
    void SetUp() override {
        ResetKernel();
        ResetPlatform();
        BeUser(0);
        Hooks().fsync = [](int) { return 0; };
        if (InMemory()) {
            volume_.emplace();
            if (!volume_->ok()) GTEST_SKIP() << "there is no second volume";
        }
        object_ = {InMemory() ? volume_->path() : dir_.path(), "object"};
        object_.MakeObject();
    }
    void TearDown() override {
        ResetKernel();
        ResetPlatform();
    }

    static bool InMemory() { return GetParam(); }

    static void Run(const Race& race) {
        void* const page = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE,
                                MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        ASSERT_NE(MAP_FAILED, page);
        auto* const shared = new (page) Shared{};
        fflush(nullptr);
        pid_t children[2];
        for (int self = 0; self < 2; ++self) {
            children[self] = fork();
            ASSERT_LE(0, children[self]);
            if (children[self] != 0) continue;
            alarm(600);
            RunRounds(race, self, shared);
            _exit(shared->trouble ? 1 : 0);
        }
        for (const pid_t child : children) {
            int status = 0;
            ASSERT_EQ(child, waitpid(child, &status, 0));
            EXPECT_EQ(0, status);
        }
        munmap(page, sizeof(Shared));
    }

    TempDir dir_;
    std::optional<SecondVolume> volume_;
    ObjectFiles object_;
};

INSTANTIATE_TEST_SUITE_P(On, MadeFilesTest, ::testing::Bool(),
                         [](const auto& test) { return test.param ? "Memory" : "Disk"; });

TEST_P(MadeFilesTest, FinderInfoThatIsWrittenIsThere) {
    const auto finder_info = [](int self) { return Pattern(32, self == 0 ? 0x10 : 0x90); };
    const auto is_written = [&](const Bytes& file, int self) {
        return file.size() == 82 && Bytes(file.begin() + 50, file.end()) == finder_info(self);
    };
    Run({.prepare = [&] { unlink(object_.resource().c_str()); },
         .call =
             [&](int self) {
                 return MAVOEAEADirFSFInfoWrite(object_.object().c_str(), finder_info(self).data());
             },
         .fault = [&](const Shared& shared) -> std::string {
             if (!Exists(object_.resource())) return "there is no file";
             const Bytes file = ReadFile(object_.resource());
             const bool written = (shared.results[0] == 0 && is_written(file, 0)) ||
                                  (shared.results[1] == 0 && is_written(file, 1));
             return written ? FaultOfResults(shared)
                            : "the file has " + std::to_string(file.size()) + " bytes";
         }});
}

TEST_P(MadeFilesTest, TwoRepairsLeaveOneRepairedFile) {
    const MacContents contents = {.attributes = {{"a", Ascii("first")}, {"b", Ascii("second")}},
                                  .finder_info = Pattern(32, 1),
                                  .fork = Pattern(3000, 2)};
    const Bytes resource = MacSidecar(contents).bytes;
    const MacContents rest = {
        .attributes = {}, .finder_info = contents.finder_info, .fork = contents.fork};
    MakeDir(object_.ea_dir());
    Run({.prepare =
             [&] {
                 unlink(object_.stream().c_str());
                 unlink(object_.resource().c_str());
                 WriteFile(object_.resource(), resource);
             },
         .call = [&](int) { return MAVOEAFixErrorAD(object_.object().c_str()); },
         .fault = [&](const Shared& shared) -> std::string {
             if (NamesIn(object_.ea_dir()).size() != 2) return "there is another file";
             if (ReadMacFile(ReadFile(object_.resource())) != rest) return "it is not repaired";
             const auto stream = ReadMacFile(ReadFile(object_.stream()));
             if (!stream || stream->attributes != contents.attributes) {
                 return "the stream has not all attributes";
             }
             return FaultOfResults(shared);
         }});
}

}  // namespace
}  // namespace mavoea::test

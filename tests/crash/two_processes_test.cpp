// Two processes that change the same stream at the same time, each by calls of its own that open
// it, do one thing and close it again: whoever finds it locked is told so and has changed nothing.
// And two that open the same object's while it is still to be converted.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <stdio.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <filesystem>
#include <new>
#include <optional>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "tests/crash/metadata.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

constexpr int kOperations = kEmulated ? 1000 : 10000;

constexpr int kLocked = 0x400;
constexpr int kNotFound = 0x2000;

// Names of one process, "0-3", and of both, "shared-1".
constexpr unsigned kOwnNames = 6;
constexpr unsigned kSharedNames = 3;
constexpr std::size_t kSharedSize = 300;
constexpr std::size_t kForkMax = 20000;

// A value that tells who wrote it whole: each byte follows from the first.
Bytes Signed(std::uint8_t seed, std::size_t size) {
    Bytes bytes(size);
    for (std::size_t i = 0; i < size; ++i) bytes[i] = static_cast<std::uint8_t>(seed + 7 * i);
    return bytes;
}
bool IsWhole(const Bytes& value) {
    return value.empty() || value == Signed(value[0], value.size());
}

// What both processes know. Only who has the stream locked for writing changes the fork's part.
struct Shared {
    int done[2];
    int refused[2];
    std::uint8_t fork_seed;  // of the last fork written
    std::size_t fork_size;
};

// One of the two.
class Writer {
 public:
    Writer(std::string path, int self, Shared* shared)
        : path_(std::move(path)),
          self_(self),
          shared_(shared),
          random_(41 + static_cast<unsigned>(self)) {}

    // As many operations as are asked for; those that find the stream locked do not count.
    void Run() {
        while (shared_->done[self_] < kOperations && trouble_.empty()) Step();
    }

    // What was neither done nor refused; empty when all was.
    const std::string& trouble() const { return trouble_; }
    // The attributes that only this one writes.
    const Items& own() const { return own_; }

 private:
    unsigned Pick(unsigned count) { return static_cast<unsigned>(random_() >> 8) % count; }

    void Step() {
        const int fd = ::open(path_.c_str(), O_RDWR);
        const unsigned kind = Pick(12);
        const bool reads = kind < 3;
        (void)TakeRecords();
        EASHandle* const h = MAVOEASOpen(fd, reads ? F_RDLCK : F_WRLCK);
        if (h == nullptr) {
            if (MLIBCErrGet() != kLocked) Trouble("open", -1);
            ++shared_->refused[self_];
            sched_yield();
        } else {
            Do(kind, h);
            if (MAVOEASClose(h) != 0) Trouble("close", -1);
            ++shared_->done[self_];
        }
        ::close(fd);
        (void)TakeCallNames();
    }

    void Do(unsigned kind, EASHandle* h) {
        switch (kind) {
            case 0:
                return ReadOwn(h);
            case 1:
                return ReadShared(h);
            case 2:
                return ReadFork(h);
            case 3:
            case 4:
            case 5:
                return WriteOwn(h);
            case 6:
                return WriteShared(h);
            case 7:
                return Remove(h, OwnName(), true);
            case 8:
                return Remove(h, SharedName(), false);
            case 9:
            case 10:
                return TruncateOwn(h);
            default:
                return WriteFork(h);
        }
    }

    std::string OwnName() { return std::to_string(self_) + "-" + std::to_string(Pick(kOwnNames)); }
    std::string SharedName() { return "shared-" + std::to_string(Pick(kSharedNames)); }

    // The value, none where there is no such attribute.
    std::optional<Bytes> Read(EASHandle* h, const std::string& name) {
        Bytes value(1);
        const int length = MAVOEASRead(h, name.c_str(), value.data(), 0, 0);
        if (length < 0) {
            if (MLIBCErrGet() != kNotFound) Trouble("length of " + name, length);
            return std::nullopt;
        }
        value.resize(static_cast<std::size_t>(length) + 1);
        const int got =
            MAVOEASRead(h, name.c_str(), value.data(), static_cast<unsigned>(length) + 1, 0);
        if (got != length) Trouble("read of " + name, got);
        value.resize(static_cast<std::size_t>(length));
        return value;
    }

    void ReadOwn(EASHandle* h) {
        const std::string name = OwnName();
        const auto value = Read(h, name);
        const auto at = own_.find(name);
        if (value != (at == own_.end() ? std::nullopt : std::optional(at->second))) {
            Trouble("wrong value of " + name, 0);
        }
    }

    void ReadShared(EASHandle* h) {
        const std::string name = SharedName();
        const auto value = Read(h, name);
        if (value && (value->size() != kSharedSize || !IsWhole(*value))) {
            Trouble("half a value of " + name, 0);
        }
    }

    void WriteOwn(EASHandle* h) {
        const std::string name = OwnName();
        const Bytes bytes = Pattern(Pick(500), static_cast<std::uint8_t>(Pick(256)));
        const unsigned offset = Pick(4) == 0 ? Pick(200) : 0;
        if (Write(h, name, bytes, offset) != static_cast<int>(bytes.size())) return;
        Bytes& value = own_[name];
        value.resize(std::max(value.size(), offset + bytes.size()));
        std::copy(bytes.begin(), bytes.end(), value.begin() + static_cast<std::ptrdiff_t>(offset));
    }

    void WriteShared(EASHandle* h) {
        (void)Write(h, SharedName(), Signed(static_cast<std::uint8_t>(Pick(256)), kSharedSize), 0);
    }

    int Write(EASHandle* h, const std::string& name, const Bytes& bytes, unsigned offset) {
        const int result =
            MAVOEASWrite(h, name.c_str(), bytes.data(), static_cast<unsigned>(bytes.size()), offset,
                         EAS_WRITE_OVERWRITE);
        if (result != static_cast<int>(bytes.size())) Trouble("write of " + name, result);
        return result;
    }

    void Remove(EASHandle* h, const std::string& name, bool own) {
        const int result = MAVOEASRemove(h, name.c_str());
        const bool absent = result != 0 && MLIBCErrGet() == kNotFound;
        if (result != 0 && !absent) Trouble("removal of " + name, result);
        if (own && absent == own_.contains(name)) Trouble("wrong removal of " + name, result);
        if (own) own_.erase(name);
    }

    // With the fork, which the caller has to move.
    void TruncateOwn(EASHandle* h) {
        const std::string name = OwnName();
        const Bytes fork = ForkOf(h);
        const unsigned length = Pick(400);
        if (MAVOEASTruncate(h, name.c_str(), length) != 0) {
            if (MLIBCErrGet() != kNotFound || own_.contains(name)) Trouble("cut of " + name, -1);
            return;
        }
        if (!own_.contains(name)) return Trouble("cut of nothing, " + name, 0);
        own_[name].resize(length);
        PutFork(h, fork);
    }

    // ---- The fork, which services read and write behind the values ----

    static Bytes ForkOf(EASHandle* h) {
        Bytes fork(U32At({h->header, 120}, kForkLengthAt));
        const auto at = static_cast<off_t>(U32At({h->header, 120}, kForkOffsetAt));
        const ssize_t got = ::pread(h->fd, fork.data(), fork.size(), at);
        fork.resize(got < 0 ? 0 : static_cast<std::size_t>(got));
        return fork;
    }

    void ReadFork(EASHandle* h) {
        if (!IsWhole(ForkOf(h))) Trouble("half a fork", 0);
    }

    void PutFork(EASHandle* h, const Bytes& fork) {
        const auto at = static_cast<off_t>(U32At({h->header, 120}, kForkOffsetAt));
        const auto end = at + static_cast<off_t>(fork.size());
        if (::pwrite(h->fd, fork.data(), fork.size(), at) != static_cast<ssize_t>(fork.size()) ||
            ::ftruncate(h->fd, end) != 0) {
            Trouble("write of the fork", errno);
        }
    }

    void WriteFork(EASHandle* h) {
        const Bytes fork =
            Signed(static_cast<std::uint8_t>(Pick(256)), Pick(3) == 0 ? 0 : Pick(kForkMax));
        PutU32({h->header, 120}, kForkLengthAt, fork.size());
        if (MAVOEASWriteHeader(h) != 0) Trouble("header", -1);
        PutFork(h, fork);
        shared_->fork_seed = fork.empty() ? 0 : fork[0];
        shared_->fork_size = fork.size();
    }

    void Trouble(const std::string& what, int result) {
        if (!trouble_.empty()) return;
        char code[32];
        snprintf(code, sizeof code, ", code 0x%X", static_cast<unsigned>(MLIBCErrGet()));
        trouble_ = what + ": " + std::to_string(result) + code;
    }

    std::string path_;
    int self_;
    Shared* shared_;
    std::minstd_rand random_;
    std::string trouble_;
    Items own_;
};

// What every write keeps: values behind the table and each other, the fork behind them, and the
// lengths that say so.
void ExpectInvariants(const Bytes& bytes) {
    const std::uint32_t start = U32At(bytes, kDataStartAt);
    const std::uint32_t end = start + U32At(bytes, kDataLengthAt);
    EXPECT_EQ(end, U32At(bytes, kTotalSizeAt));
    EXPECT_EQ(end, U32At(bytes, kForkOffsetAt));
    EXPECT_EQ(end - kFinderInfoAt, U32At(bytes, kFinderLengthAt));
    EXPECT_LE(end + U32At(bytes, kForkLengthAt), bytes.size());
    std::uint32_t record = kTableAt;
    std::uint32_t value = start;
    for (unsigned i = 0; i < U16At(bytes, kAttributeCountAt); ++i) {
        EXPECT_EQ(value, U32At(bytes, record)) << i;
        value += U32At(bytes, record + 4);
        record += RecordSize(bytes[record + 10]);
    }
    EXPECT_EQ(start, record);
    EXPECT_EQ(end, value);
}

// A process that works when `start` is closed and leaves its own items in a directory of them.
pid_t StartWriter(const TempDir& dir, int self, Shared* shared, const int start[2]) {
    fflush(nullptr);
    const pid_t child = fork();
    if (child != 0) return child;
    alarm(100);
    ::close(start[1]);
    char byte;
    if (::read(start[0], &byte, 1) != 0) _exit(2);
    Writer writer(dir / "stream", self, shared);
    writer.Run();
    const std::string report = dir / std::to_string(self);
    if (mkdir(report.c_str(), 0777) != 0) _exit(3);
    for (const auto& [name, value] : writer.own()) WriteFile(report + "/" + name, value);
    if (!writer.trouble().empty()) fprintf(stderr, "%d: %s\n", self, writer.trouble().c_str());
    fflush(nullptr);
    _exit(writer.trouble().empty() ? 0 : 1);
}

TEST(TwoProcessesTest, EveryCallDoesItsWorkOrIsToldThatTheStreamIsLocked) {
    ResetKernel();
    ResetPlatform();
    Hooks().fsync = [](int) { return 0; };
    const TempDir dir(FastDirectory());
    WriteFile(dir / "stream", {});
    void* const page =
        mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(MAP_FAILED, page);
    auto* const shared = static_cast<Shared*>(page);
    int start[2];
    ASSERT_EQ(0, pipe(start));
    pid_t children[2];
    for (int self = 0; self < 2; ++self) children[self] = StartWriter(dir, self, shared, start);
    ::close(start[0]);
    ::close(start[1]);
    Items own;
    for (int self = 0; self < 2; ++self) {
        int status = 0;
        ASSERT_EQ(children[self], waitpid(children[self], &status, 0));
        ASSERT_EQ(0, status) << self;
        EXPECT_EQ(kOperations, shared->done[self]);
        const std::string report = dir / std::to_string(self);
        for (const std::string& name : NamesIn(report)) own[name] = ReadFile(report + "/" + name);
        printf("two processes: %d done, %d found it locked\n", shared->done[self],
               shared->refused[self]);
    }

    const Bytes bytes = ReadFile(dir / "stream");
    ExpectInvariants(bytes);
    const auto contents = ReadMacFile(bytes);
    ASSERT_TRUE(contents);
    Items found;
    for (const auto& [name, value] : contents->attributes) {
        if (name.starts_with("shared-")) {
            EXPECT_EQ(kSharedSize, value.size()) << name;
            EXPECT_TRUE(IsWhole(value)) << name;
        } else {
            found[name] = value;
        }
    }
    EXPECT_TRUE(own == found) << "own attributes are not what they were left as";
    EXPECT_TRUE(contents->fork == Signed(shared->fork_seed, shared->fork_size));
    EXPECT_EQ(0, LookAtStream(dir / "stream").refusal);
    munmap(page, sizeof(Shared));
    ResetKernel();
    ResetPlatform();
}

// ---- Two opens of an object with metadata of earlier versions
// --------------------------------------

int OpenRounds() { return RaceRounds(2000); }

// Where the parent and its two children are: a child works on round n when `round` is n, and has
// done it when its `done` is n.
struct Rounds {
    std::atomic<int> round;
    std::atomic<int> done[2];
    std::atomic<int> failed;
};

const Items& Legacy() {
    static const Items& items =
        *new Items{{"color", Ascii("blue")}, {"icon", Signed(3, 6000)}, {"tags", Ascii("work")}};
    return items;
}

// Each opens the stream to write into it, as soon as the round begins.
[[noreturn]] void OpenEachRound(const ObjectFiles& object, int self, Rounds* rounds) {
    const int last = OpenRounds();
    alarm(100 + static_cast<unsigned>(last) / 100);
    for (int round = 1; round <= last; ++round) {
        while (rounds->round != round) sched_yield();
        const int fd = MAVOEAOpen(EA_FORM_FILE, object.object().c_str(), MAVOEA_KIND_STREAM,
                                  O_RDWR | O_CREAT, EA_PLACE_EADIR);
        if (fd < 0) ++rounds->failed;
        ::close(fd);
        (void)TakeCallNames();
        (void)TakeRecords();
        (void)TakeLog();
        rounds->done[self] = round;
    }
    _exit(0);
}

// What two processes find at the same time is converted once, and whole, by whichever it is.
TEST(TwoProcessesTest, OfTwoOpensAtOnceNeitherHidesWhatEarlierVersionsKept) {
    for (const std::string& place : {FastDirectory(), std::string("/tmp")}) {
        ResetKernel();
        ResetPlatform();
        Hooks().fsync = [](int) { return 0; };
        const TempDir dir(place);
        const ObjectFiles object = {dir / "share", "object"};
        MakeDir(object.parent);
        object.MakeObject();
        void* const page = mmap(nullptr, sizeof(Rounds), PROT_READ | PROT_WRITE,
                                MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        ASSERT_NE(MAP_FAILED, page);
        auto* const rounds = new (page) Rounds{};
        fflush(nullptr);
        pid_t children[2];
        for (int self = 0; self < 2; ++self) {
            children[self] = fork();
            if (children[self] == 0) OpenEachRound(object, self, rounds);
        }
        int lost = 0;
        for (int round = 1; round <= OpenRounds(); ++round) {
            std::filesystem::remove_all(object.ea_dir());
            const bool sidecar = round % 4 == 0;
            if (sidecar) {
                StreamImage image;
                for (const auto& [name, value] : Legacy()) {
                    image.attributes.push_back({name, value});
                }
                WriteFile(object.sidecar(), image.Build());
            } else {
                object.MakeFolder();
                for (const auto& [name, value] : Legacy()) {
                    WriteFile(object.folder() + "/" + name, value);
                }
            }
            rounds->round = round;
            while (rounds->done[0] != round || rounds->done[1] != round) sched_yield();
            const Bytes stream = Exists(object.stream()) ? ReadFile(object.stream()) : Bytes{};
            const auto contents = stream.empty() ? std::nullopt : ReadMacFile(stream);
            lost += contents && contents->attributes == Legacy() ? 0 : 1;
        }
        for (const pid_t child : children) {
            int status = 0;
            EXPECT_EQ(child, waitpid(child, &status, 0));
            EXPECT_EQ(0, status);
        }
        EXPECT_EQ(0, lost);
        EXPECT_EQ(0, rounds->failed);
        printf("two processes: %d rounds of two opens in %s\n", OpenRounds(), place.c_str());
        munmap(page, sizeof(Rounds));
    }
    ResetKernel();
    ResetPlatform();
}

}  // namespace
}  // namespace mavoea::test

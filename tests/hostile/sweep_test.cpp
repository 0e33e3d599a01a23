// Every way to damage a metadata file that can be counted up: each length that it may be cut to,
// each byte and each field at its extremes. Whatever is read, and whatever is written on top of it,
// ends in success or tells why not, takes no time and no memory to speak of, writes no more than
// the file is worth, and leaves nothing behind in the process.

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "adouble/ea_copy_lock.h"
#include "adouble/internal.h"
#include "include/mavoea.h"
#include "ops/ea_copy.h"
#include "ops/ea_copy_adouble.h"
#include "stream/internal.h"
#include "tests/support/emulator.h"
#include "tests/support/fake_platform.h"
#include "tests/support/identity.h"
#include "tests/support/kernel_control.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

// ---- Bounds -------------------------------------------------------------------------------------

constexpr double kMilliseconds = 10;      // of this thread's time, per operation
constexpr std::uint64_t kMemory = 65536;  // in bytes, beside the file's size
constexpr std::uint64_t kWritten = 2;     // times the file's size, beside what is new

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kInstrumented = true;
#elif defined(__has_feature)
constexpr bool kInstrumented = __has_feature(address_sanitizer) || __has_feature(memory_sanitizer);
#else
constexpr bool kInstrumented = false;
#endif

// Time is the library's only where nothing else is measured along with it.
constexpr bool kTimed = !kInstrumented && sizeof(MAVOEA_EMULATOR) == 1;

double ThreadMilliseconds() {
    timespec now;
    if (clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now) != 0) abort();
    return static_cast<double>(now.tv_sec) * 1e3 + static_cast<double>(now.tv_nsec) / 1e6;
}

// ---- Damage -------------------------------------------------------------------------------------

// Where the fields of a file are.
struct Fields {
    std::vector<std::size_t> of_16_bits;
    std::vector<std::size_t> of_32_bits;
};

// Magic, version, and `count` descriptors.
Fields AppleDoubleFields(std::size_t count) {
    Fields fields{.of_16_bits = {24}, .of_32_bits = {0, 4}};
    for (std::size_t i = 0; i < count; ++i) {
        for (std::size_t part = 0; part < 12; part += 4) {
            fields.of_32_bits.push_back(26 + 12 * i + part);
        }
    }
    return fields;
}

Fields StreamFields(const StreamImage& image) {
    Fields fields = AppleDoubleFields(2);
    for (std::size_t at = 84; at < 116; at += 4) {
        fields.of_32_bits.push_back(at);
    }
    fields.of_16_bits.insert(fields.of_16_bits.end(), {82, 116, 118});
    for (std::size_t i = 0; i < image.attributes.size(); ++i) {
        fields.of_32_bits.push_back(image.RecordAt(i));
        fields.of_32_bits.push_back(image.RecordAt(i) + 4);
        fields.of_16_bits.push_back(image.RecordAt(i) + 8);
    }
    return fields;
}

constexpr std::uint8_t kBytes[] = {0x00, 0x7F, 0x80, 0xFF};
constexpr std::uint16_t kExtremes16[] = {0, 1, 0x7FFF, 0x8000, 0xFFFF};
constexpr std::uint32_t kExtremes32[] = {0, 1, 0x7FFFFFFF, 0x80000000, 0xFFFFFFFF};

using Visit = std::function<void(const Bytes& damaged, const std::string& how)>;

void DamageFields(const Bytes& bytes, const Fields& fields, const Visit& visit) {
    for (const std::size_t at : fields.of_16_bits) {
        for (const std::uint16_t value : kExtremes16) {
            Bytes damaged = bytes;
            PutU16(damaged, at, value);
            visit(damaged, "field at " + std::to_string(at) + " is " + std::to_string(value));
        }
    }
    const auto size = static_cast<std::uint32_t>(bytes.size());
    std::vector<std::uint32_t> values(std::begin(kExtremes32), std::end(kExtremes32));
    values.insert(values.end(), {size - 1, size, size + 1});
    for (const std::size_t at : fields.of_32_bits) {
        for (const std::uint32_t value : values) {
            Bytes damaged = bytes;
            PutU32(damaged, at, value);
            visit(damaged, "field at " + std::to_string(at) + " is " + std::to_string(value));
        }
    }
}

void DamageAll(const Bytes& bytes, const Fields& fields, const Visit& visit) {
    for (std::size_t size = 0; size <= bytes.size(); size += kSeriesStep) {
        Bytes damaged = bytes;
        damaged.resize(size);
        visit(damaged, "cut to " + std::to_string(size));
    }
    for (std::size_t at = 0; at < bytes.size(); at += kSeriesStep) {
        for (const std::uint8_t value : kBytes) {
            if (bytes[at] == value) continue;
            Bytes damaged = bytes;
            damaged[at] = value;
            visit(damaged, "byte " + std::to_string(at) + " is " + std::to_string(value));
        }
    }
    DamageFields(bytes, fields, visit);
}

// ---- Measuring ----------------------------------------------------------------------------------

struct Operation {
    std::string name;
    std::function<int()> run;
    std::uint64_t value = 0;    // bytes of what is new in what it writes
    bool result_tells = false;  // its failures have no code, by design
};

class SweepTest : public ::testing::Test, protected Identity {
 protected:
    SweepTest() {
        ResetKernel();
        ResetPlatform();
        BeUser(0);
        Hooks().fsync = [](int) { return 0; };
        Hooks().sync = [] {};
        Hooks().archive = [](int) { return 0; };
        Hooks().command = [](const char*, int) { return 0; };
        Hooks().opened = [this](int fd) { opened_.push_back(fd); };
    }
    ~SweepTest() override {
        ResetKernel();
        ResetPlatform();
    }

    // Puts the damaged file in its place, and everything else as it was.
    virtual void Fill(const Bytes& bytes) = 0;
    // The size of the largest file that an operation may have written.
    virtual std::uint64_t Largest() const = 0;

    void Sweep(const std::string& kind, const Bytes& bytes, const Fields& fields,
               const std::vector<Operation>& operations, bool fields_only = false) {
        unsigned files = 0;
        unsigned runs = 0;
        const auto visit = [&](const Bytes& damaged, const std::string& how) {
            if (HasFailure()) return;
            ++files;
            for (const Operation& operation : operations) {
                ++runs;
                Measure(damaged, operation, kind + ", " + how);
            }
        };
        if (fields_only) {
            DamageFields(bytes, fields, visit);
        } else {
            DamageAll(bytes, fields, visit);
        }
        printf("swept: %s: %u damaged files, %u operations\n", kind.c_str(), files, runs);
        // How far from the bounds it all is, for whoever asks.
        if (getenv("MAVOEA_SWEEP_WORST") != nullptr) {
            printf("  worst: %.2f ms (%s), %llu bytes of memory (%s), %.2f times the size (%s)\n",
                   worst_time_, slowest_.c_str(), static_cast<unsigned long long>(worst_memory_),
                   largest_.c_str(), worst_written_, writer_.c_str());
        }
    }

 private:
    void Measure(const Bytes& damaged, const Operation& operation, const std::string& how) {
        double time = 0;
        for (int attempt = 0; attempt < 3; ++attempt) {  // Others may have had the processor.
            Fill(damaged);
            TakeRecords();
            TakeLog();
            TakePlatformCalls();
            TakeCalls();
            const Allocations before = TakeAllocations();
            TakeBytesWritten();
            opened_.clear();

            const double start = kTimed ? ThreadMilliseconds() : 0;
            const int result = operation.run();
            const double taken = kTimed ? ThreadMilliseconds() - start : 0;
            time = attempt == 0 ? taken : std::min(time, taken);

            const std::uint64_t written = TakeBytesWritten();
            const Allocations after = TakeAllocations();
            if (attempt == 0) Check(damaged, operation, how, result, before, after, written);
            CloseOpened();
            if (!kTimed || time <= kMilliseconds) break;
        }
        EXPECT_LE(time, kMilliseconds) << operation.name << ": " << how;
        Worst(time, &worst_time_, operation.name + ": " + how, &slowest_);
    }

    void Check(const Bytes& damaged, const Operation& operation, const std::string& how, int result,
               const Allocations& before, const Allocations& after, std::uint64_t written) {
        const std::string what = operation.name + ": " + how;
        const std::uint64_t size = std::max<std::uint64_t>(damaged.size(), Largest());
        const std::uint64_t memory = after.peak - before.live_bytes;
        EXPECT_LE(memory, size + kMemory + EntryTable(damaged)) << what << ", of " << size;
        EXPECT_LE(written, kWritten * size + operation.value) << what << ", of " << size;
        EXPECT_EQ(before.live, after.live) << what;
        EXPECT_LE(size, 2 * damaged.size() + operation.value + 4096) << what;
        if (result < 0 && !operation.result_tells && TakeRecords().empty() && TakeLog().empty()) {
            ADD_FAILURE() << what << " failed with " << result << " and did not say why";
        }
        Worst(static_cast<double>(memory), &worst_memory_, what, &largest_);
        if (size > 0 && written > operation.value) {
            Worst(static_cast<double>(written - operation.value) / static_cast<double>(size),
                  &worst_written_, what, &writer_);
        }
    }

    // A handle has a record in memory for each that a stream declares and that the file has room
    // for.
    static std::uint64_t EntryTable(const Bytes& bytes) {
        if (bytes.size() < kTableAt) return 0;
        const std::uint64_t count = U16At(bytes, kAttributeCountAt);
        return kTableAt + 12 * count <= bytes.size() ? sizeof(EASEntry) * count : 0;
    }

    static void Worst(double value, double* worst, const std::string& what, std::string* where) {
        if (value <= *worst) return;
        *worst = value;
        *where = what;
    }

    // A flush leaves its file open, by design.
    void CloseOpened() {
        for (const int fd : opened_) (void)::close(fd);
        opened_.clear();
    }

    std::vector<int> opened_;
    double worst_time_ = 0;
    double worst_memory_ = 0;
    double worst_written_ = 0;
    std::string slowest_;
    std::string largest_;
    std::string writer_;
};

// ---- Streams ------------------------------------------------------------------------------------

// A file without a name.
class MemoryFile {
 public:
    MemoryFile() : fd_(memfd_create("sweep", MFD_CLOEXEC)) {
        if (fd_ < 0) abort();
    }
    ~MemoryFile() { ::close(fd_); }
    MemoryFile(const MemoryFile&) = delete;
    MemoryFile& operator=(const MemoryFile&) = delete;

    int fd() const { return fd_; }
    std::uint64_t size() const {
        struct stat info;
        if (fstat(fd_, &info) != 0) abort();
        return static_cast<std::uint64_t>(info.st_size);
    }
    void Fill(const Bytes& bytes) const {
        if (ftruncate(fd_, 0) != 0 ||
            ::pwrite(fd_, bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
            abort();
        }
    }

 private:
    int fd_;
};

class StreamSweepTest : public SweepTest {
 protected:
    StreamSweepTest() { good_.Fill(StreamImage{.attributes = {{"good", Ascii("value")}}}.Build()); }

    void Fill(const Bytes& bytes) override {
        stream_.Fill(bytes);
        other_.Fill({});
    }
    std::uint64_t Largest() const override { return std::max(stream_.size(), other_.size()); }

    // `body` on a handle with that lock.
    int With(int lock, const std::function<int(EASHandle*)>& body) const {
        EASHandle* const handle = MAVOEASOpen(stream_.fd(), lock);
        if (handle == nullptr) return -1;
        const int result = body(handle);
        EXPECT_EQ(0, MAVOEASClose(handle));
        return result;
    }

    // `body` with the first attribute's name; 0 when there is none, or one that no call can give.
    int WithFirst(const std::function<int(EASHandle*, const char*)>& body) const {
        return With(F_WRLCK, [&](EASHandle* handle) {
            if (U16At(handle->header, kAttributeCountAt) == 0) return 0;
            const std::string name = handle->entries[0].name;
            return body(handle, name.c_str());
        });
    }

    static int ReadAll(EASHandle* handle) {
        MLIBCSzList* list = NewList();
        int result = MAVOEASEnum(handle, &list);
        const std::vector<std::string> names = Strings(list);
        MLIBCSzListFree(list);
        EXPECT_LE(0, result);
        std::uint8_t buffer[300];
        for (const std::string& name : names) {
            if (MAVOEASSearch(handle, name.c_str()) < 0) result = -1;
            for (const unsigned offset : {0u, 2u, 0x7FFFFFFFu, 0xFFFFFFFFu}) {
                for (const unsigned size : {0u, 1u, 300u}) {
                    const int got = MAVOEASRead(handle, name.c_str(), buffer, size, offset);
                    if (got < 0) result = -1;
                    if (size != 0) {
                        EXPECT_LE(got, static_cast<int>(size));
                    }
                }
            }
        }
        return result;
    }

    static int UpdateAll(EASHandle* handle, int remove) {
        const unsigned count = U16At(handle->header, kAttributeCountAt);
        if (count == 0) return 0;
        Bytes buffer(std::min<std::size_t>(U32At(handle->header, kDataLengthAt), 200000));
        return MAVOEASUpdateEntry(handle, count / 2, buffer.data(),
                                  static_cast<unsigned>(buffer.size()), remove);
    }

    std::vector<Operation> Operations() {
        // What a new attribute brings along, and what makes a header of an empty file.
        constexpr std::uint64_t kNew = 8 + 16 + 120;
        return {
            {.name = "count", .run = [this] { return EASGetEntryCount(stream_.fd()); }},
            {.name = "open", .run = [this] { return With(F_UNLCK, [](EASHandle*) { return 0; }); }},
            {.name = "read", .run = [this] { return With(F_RDLCK, ReadAll); }},
            {.name = "fork range",
             .run =
                 [this] {
                     return With(F_RDLCK, [](EASHandle* handle) {
                         unsigned start = 0;
                         unsigned length = 0;
                         return EASGetRForkRange(handle, &start, &length);
                     });
                 }},
            {.name = "gather, keeping",
             .run =
                 [this] {
                     return With(F_WRLCK, [](EASHandle* handle) { return UpdateAll(handle, 0); });
                 }},
            {.name = "gather, removing",
             .run =
                 [this] {
                     return With(F_WRLCK, [](EASHandle* handle) { return UpdateAll(handle, 1); });
                 }},
            {.name = "write a new one",
             .run =
                 [this] {
                     return With(F_WRLCK, [](EASHandle* handle) {
                         return MAVOEASWrite(handle, "new", "12345", 5, 3, EAS_WRITE_OVERWRITE);
                     });
                 },
             .value = kNew},
            {.name = "overwrite",
             .run =
                 [this] {
                     return WithFirst([](EASHandle* handle, const char* name) {
                         return MAVOEASWrite(handle, name, "12345", 5, 1, EAS_WRITE_OVERWRITE);
                     });
                 },
             .value = 6},
            {.name = "remove", .run = [this] { return WithFirst(MAVOEASRemove); }},
            {.name = "truncate",
             .run =
                 [this] {
                     return WithFirst([](EASHandle* handle, const char* name) {
                         return MAVOEASTruncate(handle, name, 6);
                     });
                 },
             .value = 6},
            {.name = "write the header",
             .run = [this] { return With(F_WRLCK, MAVOEASWriteHeader); },
             .value = 120},
            {.name = "write the Finder info",
             .run = [this] { return With(F_WRLCK, EASWriteFinderInfo); },
             .value = 32},
            {.name = "import from it",
             .run = [this] { return EASWriteToFd(stream_.fd(), other_.fd()); },
             .value = imports_},
            {.name = "import into it",
             .run = [this] { return EASWriteToFd(good_.fd(), stream_.fd()); },
             .value = kNew},
        };
    }

    // An import rewrites its destination once for each attribute, by design.
    std::uint64_t imports_ = 0;

    MemoryFile stream_;
    MemoryFile other_;
    MemoryFile good_;
};

TEST_F(StreamSweepTest, StreamWithAttributesAndFork) {
    const StreamImage image{
        .attributes = {{"a", Ascii("xyz")}, {"empty", {}}, {"user.comment", Pattern(50)}},
        .fork = Pattern(40),
        .finder_info = Hex("'TEXTttxt' 00*24"),
        .gap = 8,
        .slack = 12};
    imports_ = 3 * 200;
    Sweep("EA stream with attributes and fork", image.Build(), StreamFields(image), Operations());
}

TEST_F(StreamSweepTest, StreamOfOneAttributeWithItsForkListedFirst) {
    const StreamImage image{
        .attributes = {{"one", Pattern(20)}}, .fork = Pattern(30), .fork_first = true};
    imports_ = 200;
    Sweep("EA stream that lists its fork first", image.Build(), StreamFields(image), Operations());
}

TEST_F(StreamSweepTest, StreamWithTwoAttributesOfOneName) {
    const StreamImage image{.attributes = {{"twice", Ascii("1")}, {"twice", Ascii("22")}}};
    imports_ = 2 * 200;
    Sweep("EA stream with a name twice", image.Build(), StreamFields(image), Operations());
}

TEST_F(StreamSweepTest, AppleDoubleOfThirteenEntriesAsAStream) {
    imports_ = 200;
    Sweep("AppleDouble of 13 entries as EA stream", PlainAppleDouble(Pattern(32), Pattern(20), 13),
          AppleDoubleFields(13), Operations());
}

// Large enough that what is bounded by its size could not hide in the allowance beside it, and for
// a table of as many attributes as can be declared.
TEST_F(StreamSweepTest, LargeStream) {
    const StreamImage image{
        .attributes = {{"small", Ascii("1")}, {"large", Pattern(400000)}, {"last", Pattern(99)}},
        .fork = Pattern(500000)};
    imports_ = 2 * 401000;
    Sweep("large EA stream, fields only", image.Build(), StreamFields(image), Operations(), true);
}

// ---- Files beside an object ---------------------------------------------------------------------

class ObjectSweepTest : public SweepTest {
 protected:
    ObjectSweepTest() {
        for (const char* name : {"from", "to", "from/@eaDir", "to/@eaDir"}) {
            if (mkdir((dir_ / name).c_str(), 0777) != 0) abort();
        }
        WriteFile(src_, Ascii("data"));
        WriteFile(dst_, Ascii("data"));
        if (chmod(src_.c_str(), 0755) != 0 || chmod(dst_.c_str(), 0755) != 0) abort();
        const std::string view = dst_ + "/rsrc";
        const std::string fork = dir_ / "fork";
        WriteFile(fork, {});
        Hooks().stat = [=](const char* path, struct stat* info) {
            return ::stat(path == view ? fork.c_str() : path, info);
        };
        Hooks().fopen = [=](const char* path, const char* mode) {
            return ::fopen(path == view ? fork.c_str() : path, mode);
        };
        Hooks().getxattr = [this](const char*, const char*, void* value, size_t size) -> ssize_t {
            if (attribute_.empty()) {
                errno = ENODATA;
                return -1;
            }
            if (size == 0) return static_cast<ssize_t>(attribute_.size());
            if (size < attribute_.size()) {
                errno = ERANGE;
                return -1;
            }
            memcpy(value, attribute_.data(), attribute_.size());
            return static_cast<ssize_t>(attribute_.size());
        };
        Hooks().setxattr = [](const char*, const char*, const void*, size_t, int) { return 0; };
        Hooks().removexattr = [](const char*, const char*) { return 0; };
    }

    void Fill(const Bytes& bytes) override {
        for (const std::string& path : {SrcStream(), SrcResource(), SrcDouble(), DstStream(),
                                        DstResource(), DstDouble(), Out()}) {
            if (::unlink(path.c_str()) != 0 && errno != ENOENT) abort();
        }
        attribute_.clear();
        Place(bytes);
    }
    virtual void Place(const Bytes& bytes) = 0;

    std::uint64_t Largest() const override {
        std::uint64_t largest = 0;
        for (const std::string& path : {SrcStream(), SrcResource(), SrcDouble(), DstStream(),
                                        DstResource(), DstDouble(), Out()}) {
            struct stat info;
            if (::lstat(path.c_str(), &info) != 0) continue;
            largest = std::max(largest, static_cast<std::uint64_t>(info.st_size));
        }
        return largest;
    }

    static void Put(const std::string& path, const Bytes& bytes) {
        const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
        if (fd < 0 ||
            ::write(fd, bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size())) {
            abort();
        }
        ::close(fd);
    }

    int Copy(int from, int to, int move = 0) const {
        std::string dst = dst_;
        return MAVOEACopyEx(src_.c_str(), dst.data(), move, 0, from, to, 0, 0, nullptr);
    }

    std::string SrcStream() const { return dir_.path() + "/from/@eaDir/a@MavoEAStream"; }
    std::string SrcResource() const { return dir_.path() + "/from/@eaDir/a@MavoResource"; }
    std::string SrcDouble() const { return dir_.path() + "/from/._a"; }
    std::string DstStream() const { return dir_.path() + "/to/@eaDir/b@MavoEAStream"; }
    std::string DstResource() const { return dir_.path() + "/to/@eaDir/b@MavoResource"; }
    std::string DstDouble() const { return dir_.path() + "/to/._b"; }
    std::string Out() const { return dir_.path() + "/out"; }

    TempDir dir_{FastDirectory()};
    const std::string src_ = dir_ / "from/a";
    const std::string dst_ = dir_ / "to/b";
    Bytes attribute_;  // "user.netatalk.Metadata" of every object; empty: none
};

// What a record in the file's attribute takes to write, flush time included.
constexpr std::uint64_t kFreshRecord = 402 + 4;

// ---- The netatalk record ------------------------------------------------------------------------

class AttributeRecordSweepTest : public ObjectSweepTest {
 protected:
    void Place(const Bytes& bytes) override { attribute_ = bytes; }
};

TEST_F(AttributeRecordSweepTest, RecordInAnAttribute) {
    const auto operations = std::vector<Operation>{
        {.name = "parse",
         .run =
             [this] {
                 EAAdouble record = {};
                 return MAVOEAAdoubleRead(attribute_.data(), static_cast<int>(attribute_.size()),
                                          &record);
             }},
        {.name = "read",
         .run =
             [this] {
                 EAAdouble record = {};
                 return MAVOEAFileEAAdoubleRead(src_.c_str(), &record);
             }},
        {.name = "read the Finder info",
         .run =
             [this] {
                 unsigned char finder_info[32];
                 return EAFileEAFSFinfoRead(src_.c_str(), finder_info);
             }},
        {.name = "sync the Finder info",
         .run = [this] { return EAFileEAFSFinfoFileSync(src_.c_str()); },
         .value = 82},
        {.name = "copy the lock",
         .run = [this] { return MAVOEACopyLock(src_.c_str(), dst_.c_str(), 2, 2); }},
        {.name = "flush",
         .run =
             [this] {
                 return MAVOEAFileEAAdoubleFlush(attribute_.data(),
                                                 static_cast<int>(attribute_.size()), src_.c_str());
             }},
    };
    Sweep("netatalk record in an attribute", AttributeRecord(), AppleDoubleFields(8), operations);
}

// Thirteen entries, the Finder info, dates and AFP file info among them, as netatalk lays them out
// at the head of a resource file; then a fork.
Bytes ClassicRecord() {
    Bytes bytes = Hex("00 05 16 07  00 02 00 00  00*16  00 0D "
                      "00 00 00 02  00 00 02 E5  00 00 00 20 "   // fork, 741, 32
                      "00 00 00 03  00 00 00 B6  00 00 00 00 "   // name, 182
                      "00 00 00 04  00 00 01 B5  00 00 00 00 "   // comment, 437
                      "00 00 00 07  00 00 00 B6  00 00 00 00 "   // file info
                      "00 00 00 08  00 00 02 9D  00 00 00 10 "   // dates, 669, 16
                      "00 00 00 09  00 00 02 7D  00 00 00 20 "   // Finder info, 637, 32
                      "00 00 00 0D  00 00 02 AD  00 00 00 00 "   // short name, 685
                      "00 00 00 0E  00 00 02 B9  00 00 00 04 "   // AFP file info, 697, 4
                      "00 00 00 0F  00 00 02 BD  00 00 00 04 "   // directory id, 701, 4
                      "80 44 45 56  00 00 02 C1  00 00 00 08 "   // private device, 705
                      "80 49 4E 4F  00 00 02 C9  00 00 00 08 "   // private inode, 713
                      "80 53 59 4E  00 00 02 D1  00 00 00 08 "   // private sync, 721
                      "80 53 56 7E  00 00 02 D9  00 00 00 04 ")  // private id, 729
                  + Repeat(0, 741 - 182) + Pattern(32);
    const Bytes finder_info = Pattern(32, 0x40);
    std::copy(finder_info.begin(), finder_info.end(), bytes.begin() + 637);
    bytes[697 + 3] = 0x20;
    return bytes;
}

class ResourceFileSweepTest : public ObjectSweepTest {
 protected:
    void Place(const Bytes& bytes) override {
        Put(SrcResource(), bytes);
        if (both_) Put(DstResource(), bytes);
    }

    std::vector<Operation> RecordOperations() {
        both_ = true;
        return {
            {.name = "read the record",
             .run =
                 [this] {
                     EAAdouble record = {};
                     return MAVOEAEADirAdoubleRead(src_.c_str(), &record);
                 }},
            {.name = "copy the lock",
             .run = [this] { return MAVOEACopyLock(src_.c_str(), dst_.c_str(), 1, 1); }},
            {.name = "flush a record",
             .run =
                 [this] {
                     static const Bytes block(741);
                     return MAVOEAEADirAdoubleFlush(block.data(), 741, src_.c_str());
                 },
             .value = 741},
        };
    }

    std::vector<Operation> FileOperations() {
        static constexpr unsigned char kFinderInfo[32] = {'T', 'E', 'X', 'T'};
        return {
            {.name = "sync the Finder info",
             .run = [this] { return MAVOEAFileEAFSFinfoEASync(src_.c_str(), 0); },
             .value = kFreshRecord},
            {.name = "write the Finder info",
             .run = [this] { return MAVOEAEADirFSFInfoWrite(src_.c_str(), kFinderInfo); },
             .value = 82},
            {.name = "rewrite",
             .run =
                 [this] { return EACopyAdoubleV2(SrcResource().c_str(), Out().c_str(), kRewrite); },
             .value = 82,
             .result_tells = true},
            {.name = "repair",
             .run = [this] { return MAVOEAFixErrorAD(src_.c_str()); },
             .value = repaired_,
             .result_tells = true},
            {.name = "copy to an AppleDouble volume",
             .run = [this] { return Copy(1, 0); },
             .value = 82},
            {.name = "copy to attributes", .run = [this] { return Copy(1, 7); }, .value = 32},
            {.name = "copy to a file-EA volume",
             .run = [this] { return Copy(1, 2); },
             .value = 82 + kFreshRecord},
        };
    }

    bool both_ = false;
    std::uint64_t repaired_ = 82;
};

TEST_F(ResourceFileSweepTest, RecordInAResourceFile) {
    Sweep("netatalk record in a resource file", ClassicRecord(), AppleDoubleFields(13),
          RecordOperations());
}

TEST_F(ResourceFileSweepTest, ResourceFileOfTwoEntries) {
    Sweep("resource file of 2 entries", PlainAppleDouble(Pattern(32), Pattern(60)),
          AppleDoubleFields(2), FileOperations());
}

TEST_F(ResourceFileSweepTest, ResourceFileOfThirteenEntries) {
    Sweep("resource file of 13 entries", PlainAppleDouble(Pattern(32), Pattern(30), 13),
          AppleDoubleFields(13), FileOperations());
}

TEST_F(ResourceFileSweepTest, ResourceFileWithAttributes) {
    const StreamImage image{.attributes = {{"a", Ascii("xyz")}}, .fork = Pattern(20)};
    repaired_ = 82 + 160;
    Sweep("resource file with attributes", image.Build(), StreamFields(image), FileOperations());
}

TEST_F(ResourceFileSweepTest, LargeResourceFile) {
    const StreamImage image{.attributes = {{"a", Pattern(150000)}}, .fork = Pattern(200000)};
    repaired_ = 150000;
    Sweep("large resource file, fields only", image.Build(), StreamFields(image), FileOperations(),
          true);
}

class StreamFileSweepTest : public ObjectSweepTest {
 protected:
    void Place(const Bytes& bytes) override {
        Put(SrcStream(), bytes);
        Put(SrcResource(), resource_);
    }
    const Bytes resource_ = PlainAppleDouble(Pattern(32), Pattern(20));
};

TEST_F(StreamFileSweepTest, StreamToBeCopied) {
    const StreamImage image{.attributes = {{"a", Ascii("xyz")}, {"b", Pattern(20)}}};
    const auto operations = std::vector<Operation>{
        {.name = "copy to an AppleDouble volume",
         .run = [this] { return Copy(1, 0); },
         .value = 102 + 2 * 200},
        {.name = "copy to attributes", .run = [this] { return Copy(1, 7); }, .value = 52},
    };
    Sweep("EA stream to be copied", image.Build(), StreamFields(image), operations);
}

// ---- AppleDouble files --------------------------------------------------------------------------

class AppleDoubleSweepTest : public ObjectSweepTest {
 protected:
    void Place(const Bytes& bytes) override { Put(SrcDouble(), bytes); }

    std::vector<Operation> Operations() {
        return {
            {.name = "check",
             .run = [this] { return MAVOEACheckADFile(SrcDouble().c_str()); },
             .result_tells = true},
            {.name = "open",
             .run =
                 [this] {
                     const int fd = MAVOEAOpen(1, src_.c_str(), "MavoEAStream", O_RDWR, 1);
                     EASHandle* const handle = MAVOEASOpen(fd, F_RDLCK);
                     return handle == nullptr ? -1 : MAVOEASClose(handle);
                 }},
            {.name = "upgrade",
             .run = [this] { return MAVOEAUpgrade(src_.c_str(), "MavoEAStream"); }},
            {.name = "copy to an EA directory",
             .run = [this] { return Copy(0, 1); },
             .value = imports_},
            {.name = "copy to a file-EA volume",
             .run = [this] { return Copy(0, 2); },
             .value = imports_ + kFreshRecord},
            {.name = "copy to attributes", .run = [this] { return Copy(0, 7); }, .value = 32},
        };
    }

    // An import rewrites its destination once for each attribute, by design.
    std::uint64_t imports_ = 82;
};

TEST_F(AppleDoubleSweepTest, AppleDoubleFileOfTwoEntries) {
    Sweep("AppleDouble file of 2 entries", PlainAppleDouble(Pattern(32), Pattern(60)),
          AppleDoubleFields(2), Operations());
}

TEST_F(AppleDoubleSweepTest, AppleDoubleFileWithAttributes) {
    const StreamImage image{.attributes = {{"a", Ascii("xyz")}, {"user.b", Pattern(20)}},
                            .fork = Pattern(20),
                            .slack = 30};
    imports_ = 82 + 2 * 200;
    Sweep("AppleDouble file with attributes", image.Build(), StreamFields(image), Operations());
}

TEST_F(AppleDoubleSweepTest, LargeAppleDoubleFile) {
    const StreamImage image{.attributes = {{"a", Pattern(150000)}}, .fork = Pattern(200000)};
    imports_ = 150000;
    Sweep("large AppleDouble file, fields only", image.Build(), StreamFields(image), Operations(),
          true);
}

// ---- Legacy resource files ----------------------------------------------------------------------

class LegacySweepTest : public ObjectSweepTest {
 protected:
    void Place(const Bytes& bytes) override {
        const std::string folder = dir_ / "from/@eaDir/a";
        if (mkdir(folder.c_str(), 0777) != 0 && errno != EEXIST) abort();
        Put(folder + "/MAVO:Resource", bytes);
    }
};

TEST_F(LegacySweepTest, LegacyResourceFile) {
    const Bytes bytes = Hex("00 05 16 07  00 02 00 00  00*16  00 02 "
                            "00 00 00 09  00 00 00 32  00 00 00 20 "
                            "00 00 00 0E  00 00 00 52  00 00 00 04 ") +
                        Pattern(32) + Hex("00 00 00 20");
    const auto operations = std::vector<Operation>{
        {.name = "upgrade", .run = [this] { return MAVOEAUpgrade(src_.c_str(), "MavoResource"); }}};
    Sweep("legacy resource file", bytes, AppleDoubleFields(2), operations);
}

}  // namespace
}  // namespace mavoea::test

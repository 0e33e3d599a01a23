// Every call that fails while netatalk records, Finder info, the flush time and the locked state
// are read, written and carried.

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "adouble/ea_copy_lock.h"
#include "include/mavoea.h"
#include "tests/support/fault_sweep.h"
#include "tests/support/object_files.h"
#include "tests/support/process.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

constexpr char kRecord[] = "user.netatalk.Metadata";
constexpr char kFlushTime[] = "user.mavo.filea.flushtime";
constexpr char kResource[] = "@eaDir/a@MavoResource";
constexpr char kOther[] = "@eaDir/b@MavoResource";
constexpr time_t kNow = 0x65432100;

// The 741 bytes at the head of a resource file, whose AFP attributes are `attributes`.
Bytes ResourceHead(std::uint16_t attributes) {
    Bytes head = OneEntry(14, 370, 4);
    PutU16(head, 372, attributes);
    return head;
}

void SetAttribute(const std::string& path, const char* name, const Bytes& value) {
    ASSERT_EQ(0, ::setxattr(path.c_str(), name, value.data(), value.size(), 0)) << name;
}

Bytes AttributeOf(const std::string& path, const char* name) {
    Bytes value(4096);
    const ssize_t size = ::getxattr(path.c_str(), name, value.data(), value.size());
    value.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
    return value;
}

void MakeObject(FaultWorld& w, const char* name = "a") { WriteFile(w / name, Ascii("data")); }

void MakeResource(FaultWorld& w, const Bytes& bytes, const char* file = kResource) {
    MakeDir(w / "@eaDir");
    WriteFile(w / file, bytes);
}

// The record that a run reads into.
EAAdouble* RecordOfRun(FaultWorld& w) {
    if (!w.own) w.own = std::make_shared<EAAdouble>();
    return static_cast<EAAdouble*>(w.own.get());
}

// A record that is said to have been read is the one on disk.
void ExpectWholeRecord(FaultWorld& w, const FaultRun& run, const Bytes& block) {
    if (run.result != 0 || run.expected == nullptr) return;
    const EAAdouble* const record = RecordOfRun(w);
    EXPECT_TRUE(std::equal(block.begin(), block.end(), record->data)) << run.call;
    EXPECT_EQ(370, record->entries[14].offset) << run.call;
}

// ---- Parsing ------------------------------------------------------------------------------------

TEST(FaultRecordsTest, ParsingARecordMakesNoCallThatCouldFail) {
    SweepFaults({
        .name = "MAVOEAAdoubleRead",
        .prepare = [](FaultWorld& w) { w.buffer = AttributeRecord(); },
        .run =
            [](FaultWorld& w) { return MAVOEAAdoubleRead(w.buffer.data(), 402, RecordOfRun(w)); },
        .check = [](FaultWorld& w,
                    const FaultRun& run) { ExpectWholeRecord(w, run, AttributeRecord()); },
    });
}

// ---- Reading ------------------------------------------------------------------------------------

TEST(FaultRecordsTest, ReadingTheAttributeRecord) {
    constexpr char kUnit[] = "ea_fileafs_adouble_read";
    SweepFaults({
        .name = "MAVOEAFileEAAdoubleRead",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                SetAttribute(w / "a", kRecord, AttributeRecord());
            },
        .run =
            [](FaultWorld& w) {
                return MAVOEAFileEAAdoubleRead((w / "a").c_str(), RecordOfRun(w));
            },
        .check = [](FaultWorld& w,
                    const FaultRun& run) { ExpectWholeRecord(w, run, AttributeRecord()); },
        .rules =
            {
                {.call = "getxattr", .errors = {ENODATA, ENOENT}, .outcome = {.result = 1}},
                {.call = "getxattr",
                 .outcome = {.result = -1,
                             .records = {{0xA00, kUnit}},
                             .log = {"ea_fileafs_adouble_read:LINE Error: getxattr path [{dir}/a] "
                                     "{error}"},
                             .error = kInjectedErrno}},
            },
    });
}

TEST(FaultRecordsTest, ReadingTheRecordOfAResourceFile) {
    constexpr char kUnit[] = "ea_eadirfs_adouble_read";
    SweepFaults({
        .name = "MAVOEAEADirAdoubleRead",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeResource(w, ResourceHead(0x20) + Pattern(500));
            },
        .run =
            [](FaultWorld& w) { return MAVOEAEADirAdoubleRead((w / "a").c_str(), RecordOfRun(w)); },
        .check = [](FaultWorld& w,
                    const FaultRun& run) { ExpectWholeRecord(w, run, ResourceHead(0x20)); },
        .rules =
            Rules{
                TakenUpAgain("pread"),
                {.call = "open", .errors = {ENOENT}, .outcome = {.result = 1}},
                {.call = "open",
                 .outcome = {.result = -1,
                             .records = {{0x900, kUnit}},
                             .log = {"ea_eadirfs_adouble_read:LINE Error: open path [{dir}/a] "
                                     "{error}"},
                             .error = kInjectedErrno}},
                // A file that ends early is one in another layout.
                {.call = "pread", .errors = {kShort}, .outcome = {.result = 1}},
                {.call = "pread",
                 .outcome = {.result = -1,
                             .records = {{0xA00, kUnit}},
                             .log = {"ea_eadirfs_adouble_read:LINE Error: read path [{dir}/a] "
                                     "{error}"},
                             .error = kInjectedErrno}},
            },
    });
}

TEST(FaultRecordsTest, ReadingADamagedRecordOfAResourceFile) {
    constexpr char kUnit[] = "ea_eadirfs_adouble_read";
    SweepFaults({
        .name = "MAVOEAEADirAdoubleRead, damaged",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                Bytes head = ResourceHead(0);
                PutU32(head, 4, 0x00010000);
                MakeResource(w, head);
            },
        .run =
            [](FaultWorld& w) { return MAVOEAEADirAdoubleRead((w / "a").c_str(), RecordOfRun(w)); },
        .clean = {.result = -1,
                  .records = {{0xA00, "ea_adouble_read"}},
                  .log = {"ea_adouble_read:LINE ad magic[333319] and ad version[65536] error",
                          "ea_eadirfs_adouble_read:LINE EAAdoubleRead failed"}},
        .rules =
            {
                {.call = "open", .errors = {ENOENT}, .outcome = {.result = 1}},
                {.call = "open",
                 .outcome = {.result = -1,
                             .records = {{0x900, kUnit}},
                             .log = {"ea_eadirfs_adouble_read:LINE Error: open path [{dir}/a] "
                                     "{error}"}}},
                {.call = "pread",
                 .errors = {EINTR, kShortOnce},
                 .outcome = {.result = -1,
                             .records = {{0xA00, "ea_adouble_read"}},
                             .log = {"ea_adouble_read:LINE ad magic[333319] and ad version[65536] "
                                     "error",
                                     "ea_eadirfs_adouble_read:LINE EAAdoubleRead failed"}}},
                {.call = "pread", .errors = {kShort}, .outcome = {.result = 1}},
                {.call = "pread",
                 .outcome = {.result = -1,
                             .records = {{0xA00, kUnit}},
                             .log = {"ea_eadirfs_adouble_read:LINE Error: read path [{dir}/a] "
                                     "{error}"}}},
            },
    });
}

TEST(FaultRecordsTest, ReadingARecordBehindAPathThatIsTooLong) {
    static const std::string kLine =
        "ea_eadirfs_adouble_read:LINE Fail to generate path of " + kLongPath + ".";
    SweepFaults({
        .name = "MAVOEAEADirAdoubleRead, long path",
        .prepare = [](FaultWorld&) {},
        .run =
            [](FaultWorld& w) { return MAVOEAEADirAdoubleRead(kLongPath.c_str(), RecordOfRun(w)); },
        .clean = {.result = -1, .records = {{0xC300, "ea_path"}}, .log = {kLine.c_str()}},
        .rules =
            {{.call = "malloc",
              .outcome = {.result = -1, .records = {{0x200, "ea_path"}}, .log = {kLine.c_str()}}}},
    });
}

// ---- Flushing -----------------------------------------------------------------------------------

TEST(FaultRecordsTest, FlushingTheAttributeRecord) {
    constexpr char kUnit[] = "ea_fileeafs_flush";
    for (const bool present : {true, false}) {
        SweepFaults({
            .name = present ? "MAVOEAFileEAAdoubleFlush, over a record"
                            : "MAVOEAFileEAAdoubleFlush, the first record",
            .prepare =
                [present](FaultWorld& w) {
                    MakeObject(w);
                    if (present) SetAttribute(w / "a", kRecord, AttributeRecord());
                },
            .run =
                [](FaultWorld& w) {
                    const Bytes block = Pattern(402, 7);
                    return MAVOEAFileEAAdoubleFlush(block.data(), 402, (w / "a").c_str());
                },
            .check =
                [](FaultWorld& w, const FaultRun& run) {
                    if (run.result == 0) {
                        EXPECT_EQ(Pattern(402, 7), AttributeOf(w / "a", kRecord));
                    }
                },
            .rules =
                {
                    {.call = "setxattr",
                     .errors = {EPERM},
                     .outcome = {.result = -1,
                                 .records = {{0x300, kUnit}},
                                 .error = kInjectedErrno}},
                    {.call = "setxattr",
                     .outcome = {.result = -1,
                                 .records = {{0xB00, kUnit}},
                                 .error = kInjectedErrno}},
                },
        });
    }
}

// Descriptors of resource files that stay open, which is how flushing a record there ends, are
// closed with the world.
struct LeftOpen {
    std::vector<int> opened = {};

    static LeftOpen& Of(FaultWorld& w) { return *static_cast<LeftOpen*>(w.own.get()); }
    static void Watch(FaultWorld& w) {
        const auto all = std::make_shared<LeftOpen>();
        w.own = all;
        Hooks().opened = [all = all.get()](int fd) { all->opened.push_back(fd); };
    }
    // Those that are open still.
    std::vector<int> Now() const {
        std::vector<int> all;
        for (const int fd : opened) {
            if (fcntl(fd, F_GETFD) < 0) continue;
            const std::string link = "/proc/self/fd/" + std::to_string(fd);
            const std::string file = std::filesystem::read_symlink(link).string();
            if (file.find("@MavoResource") != std::string::npos) all.push_back(fd);
        }
        std::sort(all.begin(), all.end());
        all.erase(std::unique(all.begin(), all.end()), all.end());
        return all;
    }
    static void Close(FaultWorld& w) {
        Hooks().opened = nullptr;
        if (!w.own) return;
        for (const int fd : Of(w).Now()) ::close(fd);
    }
};

TEST(FaultRecordsTest, FlushingARecordOverTheHeadOfAResourceFile) {
    constexpr char kUnit[] = "ea_eadirfs_flush";
    SweepFaults({
        .name = "MAVOEAEADirAdoubleFlush, over a resource file",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeResource(w, ResourceHead(0) + Pattern(4259));
                LeftOpen::Watch(w);
            },
        .run =
            [](FaultWorld& w) {
                const Bytes block = ResourceHead(0x20);
                return MAVOEAEADirAdoubleFlush(block.data(), 741, (w / "a").c_str());
            },
        .finish = LeftOpen::Close,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                // It is not closed, on any way out.
                EXPECT_EQ(LeftOpen::Of(w).opened.size(), LeftOpen::Of(w).Now().size()) << run.call;
                if (run.expected == nullptr) return;
                const Bytes file = ReadFile(w / kResource);
                ASSERT_EQ(5000u, file.size()) << run.call;
                EXPECT_EQ(Pattern(4259), Bytes(file.begin() + 741, file.end())) << run.call;
            },
        .rules =
            Rules{
                TakenUpAgain("pwrite"),
                // It is opened once more, to be created.
                {.call = "open", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
                {.call = "open",
                 .outcome = {.result = -1,
                             .records = {{0x900, kUnit}},
                             .log = {"ea_eadirfs_flush:LINE Error open path [{dir}/a] {error}"},
                             .error = kInjectedErrno}},
                {.call = "pwrite",
                 .errors = {kShort},
                 .outcome = {.result = -1,
                             .records = {{0xB00, kUnit}},
                             .log = {"ea_eadirfs_flush:LINE Error: write path [{dir}/a] "
                                     "Input/output error"},
                             .torn = {kResource}}},
                {.call = "pwrite",
                 .outcome = {.result = -1,
                             .records = {{0xB00, kUnit}},
                             .log = {"ea_eadirfs_flush:LINE Error: write path [{dir}/a] {error}"},
                             .error = kInjectedErrno}},
            },
    });
}

TEST(FaultRecordsTest, FlushingARecordIntoANewResourceFileLeavesNoneWhenItFails) {
    constexpr char kUnit[] = "ea_eadirfs_flush";
    SweepFaults({
        .name = "MAVOEAEADirAdoubleFlush, a new resource file",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeDir(w / "@eaDir");
                LeftOpen::Watch(w);
            },
        .run =
            [](FaultWorld& w) {
                const Bytes block = ResourceHead(0x20);
                return MAVOEAEADirAdoubleFlush(block.data(), 741, (w / "a").c_str());
            },
        .finish = LeftOpen::Close,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                EXPECT_EQ(LeftOpen::Of(w).opened.size(), LeftOpen::Of(w).Now().size()) << run.call;
                if (run.expected == nullptr) return;
                EXPECT_EQ(run.result == 0, Exists(w / kResource)) << run.call;
            },
        .rules =
            Rules{
                TakenUpAgain("pwrite"),
                // There is none: as it is.
                {.call = "open",
                 .ordinal = 1,
                 .errors = {ENOENT},
                 .outcome = {.files = Files::kDone}},
                {.call = "open",
                 .outcome = {.result = -1,
                             .records = {{0x900, kUnit}},
                             .log = {"ea_eadirfs_flush:LINE Error open path [{dir}/a] {error}"},
                             .error = kInjectedErrno}},
                {.call = "pwrite",
                 .errors = {kShort},
                 .outcome = {.result = -1,
                             .records = {{0xB00, kUnit}},
                             .log = {"ea_eadirfs_flush:LINE Error: write path [{dir}/a] "
                                     "Input/output error"}}},
                {.call = "pwrite",
                 .outcome = {.result = -1,
                             .records = {{0xB00, kUnit}},
                             .log = {"ea_eadirfs_flush:LINE Error: write path [{dir}/a] {error}"},
                             .error = kInjectedErrno}},
            },
    });
}

TEST(FaultRecordsTest, FlushingARecordBehindAPathThatIsTooLong) {
    static const std::string kLine =
        "ea_eadirfs_flush:LINE Fail to generate path of " + kLongPath + ".";
    SweepFaults({
        .name = "MAVOEAEADirAdoubleFlush, long path",
        .prepare = [](FaultWorld& w) { w.buffer = ResourceHead(0); },
        .run =
            [](FaultWorld& w) {
                return MAVOEAEADirAdoubleFlush(w.buffer.data(), 741, kLongPath.c_str());
            },
        .clean = {.result = -1, .records = {{0xC300, "ea_path"}}, .log = {kLine.c_str()}},
        .rules =
            {{.call = "malloc",
              .outcome = {.result = -1, .records = {{0x200, "ea_path"}}, .log = {kLine.c_str()}}}},
    });
}

// ---- Finder info into the attribute -------------------------------------------------------------

// A resource file with an attribute area, as streams have it.
Bytes ResourceWithAttribute() {
    StreamImage image;
    image.attributes = {{"color", Ascii("blue")}};
    image.finder_info = Pattern(32, 0x30);
    return image.Build();
}

// What of the record and the stamp there is.
Rules SettingBothAttributes() {
    return {
        {.call = "setxattr",
         .with = kRecord,
         .errors = {EPERM},
         .outcome = {.result = -1, .records = {{0x300, "ea_fileeafs_flush"}}, .torn = {"a"}}},
        {.call = "setxattr",
         .with = kRecord,
         .outcome = {.result = -1, .records = {{0xB00, "ea_fileeafs_flush"}}, .torn = {"a"}}},
        {.call = "setxattr",
         .with = kFlushTime,
         .outcome = {.result = -1,
                     .records = {{0x2A00, "ea_fileeafs_write_flush_time"}},
                     .error = kInjectedErrno,
                     .torn = {"a"}}},
    };
}

// Of the two attributes, that whose call failed is as before and the other as it should be.
void ExpectTheOtherAttribute(FaultWorld& w, const FaultRun& run) {
    if (run.expected == nullptr || !run.call.starts_with("setxattr")) return;
    EXPECT_EQ(Ascii("data"), ReadFile(w / "a"));
    if (run.call.find(kRecord) != std::string::npos) {
        EXPECT_EQ(AttributeRecord(), AttributeOf(w / "a", kRecord));
        EXPECT_EQ(Hex("65 43 21 00"), AttributeOf(w / "a", kFlushTime));
    } else {
        EXPECT_NE(AttributeRecord(), AttributeOf(w / "a", kRecord));
        EXPECT_EQ(402u, AttributeOf(w / "a", kRecord).size());
        EXPECT_EQ(Bytes{}, AttributeOf(w / "a", kFlushTime));
    }
}

void PrepareForSync(FaultWorld& w) {
    MakeObject(w);
    SetAttribute(w / "a", kRecord, AttributeRecord());
    Platform().fs_type = [](const std::string&, int) { return 2; };
    Hooks().time = [] { return kNow; };
}

TEST(FaultRecordsTest, BringingFinderInfoFromTheResourceFileIntoTheAttribute) {
    SweepFaults({
        .name = "MAVOEAFileEAFSFinfoEASync",
        .prepare =
            [](FaultWorld& w) {
                PrepareForSync(w);
                MakeResource(w, ResourceWithAttribute());
            },
        .run = [](FaultWorld& w) { return MAVOEAFileEAFSFinfoEASync((w / "a").c_str(), 1); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                ExpectTheOtherAttribute(w, run);
                if (run.call.empty()) {
                    const Bytes record = AttributeOf(w / "a", kRecord);
                    ASSERT_EQ(402u, record.size());
                    EXPECT_EQ(Pattern(32, 0x30), Bytes(record.begin() + 122, record.begin() + 154));
                }
            },
        .rules =
            SettingBothAttributes() +
            Rules{
                TakenUpAgain("pread"),
                // A type that is not told is none on which there is anything to do.
                {.call = "MAVOGetFSType"},
                // What is missing is looked for where earlier versions kept it, and opened again.
                {.call = "open", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
                {.call = "open", .outcome = {.result = -1, .error = kInjectedErrno}},
                {.call = "malloc",
                 .ordinal = 2,
                 .outcome = {.result = -1, .records = {{0x200, "eas_alloc_entry"}}}},
                {.call = "malloc", .outcome = {.result = -1, .records = {{0x200, "eas_open"}}}},
                {.call = "setlock",
                 .ordinal = 1,
                 .outcome = {.result = -1, .records = {{0x400, "eas_lock_set"}}}},
                // Finder info that has been read is carried, whatever becomes of the lock.
                {.call = "setlock",
                 .ordinal = 2,
                 .outcome = {.records = {{0x400, "eas_lock_set"}}, .files = Files::kDone}},
                // What is needed of the file is read again by itself.
                {.call = "pread", .errors = {EIO, kNoneOnce}, .outcome = {.files = Files::kDone}},
                {.call = "pread", .outcome = {.result = -1, .records = {{0xA00, "eas_open"}}}},
            },
    });
}

TEST(FaultRecordsTest, BringingNoFinderInfoIntoTheAttribute) {
    SweepFaults({
        .name = "MAVOEAFileEAFSFinfoEASync, no resource file",
        .prepare = PrepareForSync,
        .run = [](FaultWorld& w) { return MAVOEAFileEAFSFinfoEASync((w / "a").c_str(), 0); },
        .check = ExpectTheOtherAttribute,
        .rules = SettingBothAttributes() +
                 Rules{
                     {.call = "open", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
                     {.call = "open", .outcome = {.result = -1, .error = kInjectedErrno}},
                     {.call = "access",
                      .errors = {ENOENT, ENOTDIR, ENAMETOOLONG},
                      .outcome = {.files = Files::kDone}},
                     // A failed upgrade is passed over where no file is made.
                     {.call = "access",
                      .outcome = {.records = {{0x900, "ea_upgrade"}}, .files = Files::kDone}},
                 },
    });
}

TEST(FaultRecordsTest, StampingTheFlushTime) {
    SweepFaults({
        .name = "MAVOEAFileEAWriteFlushTime",
        .prepare = PrepareForSync,
        .run = [](FaultWorld& w) { return MAVOEAFileEAWriteFlushTime((w / "a").c_str(), 1); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ(Hex("65 43 21 00"), AttributeOf(w / "a", kFlushTime));
                }
            },
        .rules =
            {
                {.call = "MAVOGetFSType"},
                {.call = "setxattr",
                 .outcome = {.result = -1,
                             .records = {{0x2A00, "ea_fileeafs_write_flush_time"}},
                             .error = kInjectedErrno}},
            },
    });
}

// ---- Finder info into the resource file ---------------------------------------------------------

constexpr char kWriteUnit[] = "ea_eadirfs_finfo_write";

long long WriteFinderInfoOfA(FaultWorld& w) {
    const Bytes info = Pattern(32, 0x50);
    return MAVOEAEADirFSFInfoWrite((w / "a").c_str(), info.data());
}

TEST(FaultRecordsTest, WritingFinderInfoIntoANewResourceFileLeavesNoEmptyOneWhenItFails) {
    // As it is before, but for the EA directory.
    const auto failed = [](std::vector<ExpectedRecord> records) {
        return Outcome{.result = -1, .records = std::move(records), .made = {"@eaDir"}};
    };
    SweepFaults({
        .name = "MAVOEAEADirFSFInfoWrite, a new resource file",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                BeUser(w);
            },
        .run = WriteFinderInfoOfA,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ(82u, ReadFile(w / kResource).size());
                }
                if (run.expected != nullptr && Exists(w / kResource)) {
                    EXPECT_FALSE(ReadFile(w / kResource).empty()) << run.call;
                }
            },
        .state = UserOf,
        .rules =
            Rules{
                TakenUpAgain("pwrite"),
                {.call = "seteuid",
                 .ordinal = 1,
                 .outcome = {.result = -1, .records = {{0x3C00, "ea_mkdir.c"}}}},
                // Nobody is told when there is no way back.
                {.call = "seteuid",
                 .ordinal = 2,
                 .outcome = {.files = Files::kDone, .torn = {"(state)"}}},
                {.call = "malloc",
                 .ordinal = 1,
                 .outcome = {.result = -1, .records = {{0x100, "ea_mkdir.c"}}}},
                // Said to be there: nothing can be created in it then.
                {.call = "mkdir", .errors = {EEXIST}, .outcome = {.result = -1}},
                {.call = "mkdir", .outcome = {.result = -1, .records = {{0x3C00, "ea_mkdir.c"}}}},
                {.call = "open",
                 .with = "{dir}/@eaDir, ",
                 .outcome = {.result = -1, .records = {{0x2A00, "ea_mkdir.c"}}}},
                // The directory is left in place.
                {.call = "fchmod", .outcome = failed({{0x2A00, "ea_mkdir.c"}})},
                {.call = "fstat", .ordinal = 1, .outcome = failed({{0x2A00, "ea_mkdir.c"}})},
                // A file that cannot be told to be the one that was opened is opened anew.
                {.call = "lstat", .with = "@MavoResource", .outcome = {.files = Files::kDone}},
                {.call = "fstat", .outcome = {.files = Files::kDone}},
                {.call = "lstat", .outcome = failed({{0x2A00, "ea_mkdir.c"}})},
                {.call = "MAVOGetFSType", .outcome = {.files = Files::kDone}},
                {.call = "MAVOACLSetEADirACL", .outcome = {.files = Files::kDone}},
                {.call = "open",
                 .with = "@MavoResource, O_RDWR|O_CLOEXEC|O_NOFOLLOW",
                 .errors = {ENOENT},
                 .outcome = {.files = Files::kDone}},
                {.call = "open",
                 .with = "@MavoResource",
                 .outcome = {.result = -1, .error = kInjectedErrno, .made = {"@eaDir"}}},
                {.call = "access",
                 .errors = {ENOENT, ENOTDIR, ENAMETOOLONG},
                 .outcome = {.files = Files::kDone}},
                {.call = "access", .outcome = failed({{0x900, "ea_upgrade"}})},
                {.call = "malloc", .ordinal = 2, .outcome = failed({{0x200, "eas_open"}})},
                {.call = "malloc", .outcome = failed({{0x200, "eas_alloc_entry"}})},
                {.call = "setlock", .ordinal = 1, .outcome = failed({{0x400, "eas_lock_set"}})},
                {.call = "setlock",
                 .outcome = {.records = {{0x400, "eas_lock_set"}}, .files = Files::kDone}},
                {.call = "lseek", .ordinal = 1, .outcome = failed({{0xA00, "eas_open"}})},
                // Of an empty file nothing is needed.
                {.call = "pread", .outcome = {.files = Files::kDone}},
                {.call = "lseek", .outcome = failed({{0xD00, kWriteUnit}})},
                // A file that is not empty stays.
                {.call = "pwrite",
                 .errors = {kShortThenNone},
                 .outcome = {.result = -1,
                             .records = {{0xB00, kWriteUnit}},
                             .made = {"@eaDir", kResource}}},
                {.call = "pwrite", .outcome = failed({{0xB00, kWriteUnit}})},
            },
    });
}

TEST(FaultRecordsTest, WritingFinderInfoOnAnAttributeVolumeHidesTheNewDirectory) {
    SweepFaults({
        .name = "MAVOEAEADirFSFInfoWrite, type 7",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                Platform().fs_type = [](const std::string&, int) { return 7; };
                // No filesystem here has this attribute: the world keeps it.
                Hooks().setxattr = [&w](const char* path, const char* name, const void*,
                                        std::size_t size, int) {
                    w.text = std::string(path).substr(w.dir.size()) + " " + name + " " +
                             std::to_string(size);
                    return 0;
                };
            },
        .run = WriteFinderInfoOfA,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ("/@eaDir com.apple.FinderInfo 32", w.text);
                    EXPECT_EQ(82u, ReadFile(w / kResource).size());
                }
            },
        .rules =
            Rules{
                TakenUpAgain("pwrite"),
                {.call = "malloc",
                 .ordinal = 1,
                 .outcome = {.result = -1, .records = {{0x100, "ea_mkdir.c"}}}},
                {.call = "mkdir", .errors = {EEXIST}, .outcome = {.result = -1}},
                {.call = "mkdir", .outcome = {.result = -1, .records = {{0x3C00, "ea_mkdir.c"}}}},
                {.call = "MAVOGetFSType", .outcome = {.files = Files::kDone}},
                {.call = "MAVOACLSetEADirACL", .outcome = {.files = Files::kDone}},
                {.call = "setxattr",
                 .outcome = {.result = -1,
                             .records = {{0x2A00, "ea_mkdir.c"}},
                             .made = {"@eaDir"}}},
                {.call = "open",
                 .with = "@MavoResource, O_RDWR|O_CLOEXEC|O_NOFOLLOW",
                 .errors = {ENOENT},
                 .outcome = {.files = Files::kDone}},
                // A file that cannot be told to be the one that was opened is opened anew.
                {.call = "lstat", .with = "@MavoResource", .outcome = {.files = Files::kDone}},
                {.call = "fstat", .ordinal = 3, .outcome = {.files = Files::kDone}},
                {.call = "open",
                 .with = "@MavoResource",
                 .outcome = {.result = -1, .error = kInjectedErrno, .made = {"@eaDir"}}},
                {.call = "access", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
                {.call = "access",
                 .outcome = {.result = -1,
                             .records = {{0x900, "ea_upgrade"}},
                             .error = kInjectedErrno,
                             .made = {"@eaDir"}}},
                {.call = "setlock",
                 .ordinal = 2,
                 .outcome = {.records = {{0x400, "eas_lock_set"}}, .files = Files::kDone}},
                // Of an empty file nothing is needed.
                {.call = "pread", .outcome = {.files = Files::kDone}},
                {.call = "pwrite",
                 .errors = {kShortThenNone},
                 .outcome = {.result = -1,
                             .records = {{0xB00, kWriteUnit}},
                             .made = {"@eaDir", kResource}}},
                {.call = "open",
                 .with = "{dir}/@eaDir, ",
                 .outcome = {.result = -1, .records = {{0x2A00, "ea_mkdir.c"}}}},
                // What else fails leaves the directory and no file in it.
                {.call = "", .outcome = {.result = -1, .made = {"@eaDir"}, .any_records = true}},
            },
    });
}

TEST(FaultRecordsTest, WritingFinderInfoOverThatOfAResourceFile) {
    SweepFaults({
        .name = "MAVOEAEADirFSFInfoWrite, over a resource file",
        .prepare =
            [](FaultWorld& w) {
                MakeObject(w);
                MakeResource(w, ResourceWithAttribute());
            },
        .run = WriteFinderInfoOfA,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                // Nothing changes but those 32 bytes.
                Bytes file = ReadFile(w / kResource);
                const Bytes former = ResourceWithAttribute();
                ASSERT_EQ(former.size(), file.size()) << run.call;
                std::copy(former.begin() + 50, former.begin() + 82, file.begin() + 50);
                EXPECT_EQ(former, file) << run.call;
            },
        .rules =
            Rules{
                TakenUpAgain("pread"),
                TakenUpAgain("pwrite"),
                {.call = "open", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
                {.call = "open", .outcome = {.result = -1, .error = kInjectedErrno}},
                // A file that cannot be told to be the one that was opened is opened anew.
                {.call = "lstat", .with = "@MavoResource", .outcome = {.files = Files::kDone}},
                {.call = "fstat", .outcome = {.files = Files::kDone}},
                {.call = "malloc",
                 .ordinal = 2,
                 .outcome = {.result = -1, .records = {{0x200, "eas_alloc_entry"}}}},
                {.call = "malloc", .outcome = {.result = -1, .records = {{0x200, "eas_open"}}}},
                {.call = "setlock",
                 .ordinal = 1,
                 .outcome = {.result = -1, .records = {{0x400, "eas_lock_set"}}}},
                {.call = "setlock",
                 .outcome = {.records = {{0x400, "eas_lock_set"}}, .files = Files::kDone}},
                {.call = "lseek",
                 .with = "lseek(50, ",
                 .outcome = {.result = -1,
                             .records = {{0xD00, kWriteUnit}},
                             .log = {"ea_eadirfs_finfo_write:LINE Error: lseek error ({error})"}}},
                {.call = "lseek", .outcome = {.result = -1, .records = {{0xD00, kWriteUnit}}}},
                // What is needed of the file is read again by itself.
                {.call = "pread", .errors = {EIO, kNoneOnce}, .outcome = {.files = Files::kDone}},
                {.call = "pread", .outcome = {.result = -1, .records = {{0xA00, "eas_open"}}}},
                {.call = "pwrite",
                 .errors = {kShort},
                 .outcome = {.result = -1, .records = {{0xB00, kWriteUnit}}, .torn = {kResource}}},
                {.call = "pwrite", .outcome = {.result = -1, .records = {{0xB00, kWriteUnit}}}},
            },
    });
}

TEST(FaultRecordsTest, WritingFinderInfoBehindAPathThatIsTooLong) {
    SweepFaults({
        .name = "MAVOEAEADirFSFInfoWrite, long path",
        .prepare = [](FaultWorld&) {},
        .run =
            [](FaultWorld&) {
                const Bytes info = Pattern(32, 0x50);
                return MAVOEAEADirFSFInfoWrite(kLongPath.c_str(), info.data());
            },
        .clean = {.result = -1, .records = {{0xC300, "ea_path"}}},
        .rules = {{.call = "malloc", .outcome = {.result = -1, .records = {{0x200, "ea_path"}}}}},
    });
}

TEST(FaultRecordsTest, WritingTheFinderInfoOfAHandle) {
    SweepFaults({
        .name = "EASWriteFinderInfo",
        .prepare =
            [](FaultWorld& w) {
                WriteFile(w / "stream", ResourceWithAttribute());
                w.fd = ::open((w / "stream").c_str(), O_RDWR | O_CLOEXEC);
                w.handle = MAVOEASOpen(w.fd, F_WRLCK);
                ASSERT_NE(nullptr, w.handle);
                const Bytes info = Pattern(32, 0x50);
                std::copy(info.begin(), info.end(), w.handle->header + 50);
            },
        .run = [](FaultWorld& w) { return EASWriteFinderInfo(w.handle); },
        .finish =
            [](FaultWorld& w) {
                if (w.handle != nullptr) MAVOEASClose(w.handle);
                ::close(w.fd);
            },
        .rules =
            Rules{
                TakenUpAgain("pwrite"),
                {.call = "lseek",
                 .outcome = {.result = -1,
                             .records = {{0xD00, kWriteUnit}},
                             .log = {"ea_eadirfs_finfo_write:LINE Error: lseek error ({error})"},
                             .error = kInjectedErrno}},
                {.call = "pwrite",
                 .errors = {kShort},
                 .outcome = {.result = -1, .records = {{0xB00, kWriteUnit}}, .torn = {"stream"}}},
                {.call = "pwrite",
                 .outcome = {.result = -1,
                             .records = {{0xB00, kWriteUnit}},
                             .error = kInjectedErrno}},
            },
    });
}

// ---- The locked state ---------------------------------------------------------------------------

constexpr char kLockUnit[] = "ea_copy_lock";

// The line that wraps a failure, which quotes the record that it left or none.
#define LOCK_LINE(quoted) \
    "ea_copy_lock:LINE [" quoted "]EACopy lock fail: from [{dir}/a] to [{dir}/b] {error}"
constexpr char kNotToldLine[] =
    "ea_copy_lock:LINE [0x0000 :LINE]EACopy lock fail: from [{dir}/a] to [{dir}/b] Success";
constexpr char kNoRecordLine[] = LOCK_LINE("0x0000 :LINE");

long long CopyLock(FaultWorld& w, int from, int to) {
    return MAVOEACopyLock((w / "a").c_str(), (w / "b").c_str(), from, to);
}

void MakeTwoObjects(FaultWorld& w, mode_t source, mode_t destination) {
    MakeObject(w, "a");
    MakeObject(w, "b");
    ASSERT_EQ(0, chmod((w / "a").c_str(), source));
    ASSERT_EQ(0, chmod((w / "b").c_str(), destination));
}

constexpr unsigned kLockedBit = 0x20;

// The platform says that "a" is locked, or that nothing is. The attribute word is in host order.
void SayLocked(bool locked) {
    Platform().file_stat = [locked](const std::string& path, unsigned char info[128]) {
        const std::uint32_t word = locked && path.ends_with("/a") ? kLockedBit : 0;
        memcpy(info + 116, &word, sizeof word);
        return 0;
    };
    Hooks().command = [](const char*, int) { return 0; };
}

TEST(FaultLockTest, WritePermissionsFromModeToMode) {
    for (const mode_t mode : {mode_t{0444}, mode_t{0640}}) {
        SweepFaults({
            .name = mode == 0444 ? "MAVOEACopyLock 0 to 0, locked" : "MAVOEACopyLock 0 to 0",
            .prepare = [mode](FaultWorld& w) { MakeTwoObjects(w, mode, 0644); },
            .run = [](FaultWorld& w) { return CopyLock(w, 0, 0); },
            .check =
                [mode](FaultWorld& w, const FaultRun& run) {
                    if (run.call.empty()) {
                        EXPECT_EQ(mode == 0444 ? 0444 : 0666, ModeOf(w / "b"));
                    }
                },
            .rules =
                {
                    // What is not there has nothing to carry.
                    {.call = "access"},
                    {.call = "stat", .outcome = {.result = -1, .log = {kNoRecordLine}}},
                    {.call = "chmod",
                     .outcome = {.result = -1,
                                 .records = {{0x2A00, kLockUnit}},
                                 .log = {LOCK_LINE("0x2A00 ea_copy_lock:LINE")}}},
                },
        });
    }
}

TEST(FaultLockTest, TypesThatAreAskedFor) {
    SweepFaults({
        .name = "MAVOEACopyLock, types asked for",
        .prepare =
            [](FaultWorld& w) {
                MakeTwoObjects(w, 0444, 0644);
                Platform().fs_type = [](const std::string& path, int) {
                    return path.ends_with("/a") ? 7 : 5;
                };
            },
        .run = [](FaultWorld& w) { return CopyLock(w, -1, -1); },
        .rules =
            {
                {.call = "access"},
                {.call = "MAVOGetFSType",
                 .with = "{dir}/a, 1",
                 .outcome = {.result = -1,
                             .log = {"ea_copy_lock:LINE(MAVOEACopyLock) Failed to get fs type of "
                                     "{dir}/a."}}},
                {.call = "MAVOGetFSType",
                 .with = "{dir}, 1",
                 .outcome = {.result = -1,
                             .log = {"ea_copy_lock:LINE(MAVOEACopyLock) Failed to get fs type of "
                                     "{dir}/b."}}},
                {.call = "stat", .outcome = {.result = -1, .log = {kNoRecordLine}}},
                {.call = "chmod",
                 .outcome = {.result = -1,
                             .records = {{0x2A00, kLockUnit}},
                             .log = {LOCK_LINE("0x2A00 ea_copy_lock:LINE")}}},
            },
    });
}

// What a record in a resource file, or the lack of one, makes of the copy.
Rules ReadingRecordOf(const char* resource_file, const char* open_line, const char* read_line) {
    return {
        {.call = "open", .with = resource_file, .ordinal = 1, .errors = {ENOENT}},
        {.call = "open",
         .with = resource_file,
         .ordinal = 1,
         .outcome = {.result = -1,
                     .records = {{0x900, "ea_eadirfs_adouble_read"}},
                     .log = {open_line, LOCK_LINE("0x0900 ea_eadirfs_adouble_read:LINE")}}},
        {.call = "pread", .errors = {EINTR, kShortOnce}, .outcome = {.files = Files::kDone}},
        {.call = "pread", .errors = {kShort}},
        {.call = "pread",
         .outcome = {.result = -1,
                     .records = {{0xA00, "ea_eadirfs_adouble_read"}},
                     .log = {read_line, LOCK_LINE("0x0A00 ea_eadirfs_adouble_read:LINE")}}},
    };
}

TEST(FaultLockTest, TheFlagFromOneEADirectoryToAnother) {
    SweepFaults({
        .name = "MAVOEACopyLock 1 to 1, by the flag",
        .prepare =
            [](FaultWorld& w) {
                MakeTwoObjects(w, 0644, 0644);
                MakeResource(w, ResourceHead(0), kOther);
                SayLocked(true);
                LeftOpen::Watch(w);
            },
        .run = [](FaultWorld& w) { return CopyLock(w, 1, 1); },
        .finish = LeftOpen::Close,
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ(0xA0, ReadFile(w / kOther)[372]);
                }
            },
        .rules =
            Rules{
                {.call = "access"},
                {.call = "MLIBCFileStat", .outcome = {.result = -1, .log = {kNotToldLine}}},
                // Whether the platform takes the flag is not asked.
                {.call = "command", .outcome = {.files = Files::kDone}},
            } +
            ReadingRecordOf(kOther,
                            "ea_eadirfs_adouble_read:LINE Error: open path [{dir}/b] {error}",
                            "ea_eadirfs_adouble_read:LINE Error: read path [{dir}/b] {error}") +
            Rules{
                {.call = "open", .errors = {ENOENT}, .outcome = {.files = Files::kDone}},
                {.call = "open",
                 .outcome = {.result = -1,
                             .records = {{0x900, "ea_eadirfs_flush"}},
                             .log = {"ea_eadirfs_flush:LINE Error open path [{dir}/b] {error}",
                                     LOCK_LINE("0x0900 ea_eadirfs_flush:LINE")}}},
                {.call = "pwrite",
                 .errors = {EINTR, kShortOnce},
                 .outcome = {.files = Files::kDone}},
                {.call = "pwrite",
                 .errors = {kShort},
                 .outcome = {.result = -1,
                             .records = {{0xB00, "ea_eadirfs_flush"}},
                             .log = {"ea_eadirfs_flush:LINE Error: write path [{dir}/b] "
                                     "Input/output error",
                                     "ea_copy_lock:LINE [0x0B00 ea_eadirfs_flush:LINE]EACopy lock "
                                     "fail: from [{dir}/a] to [{dir}/b] Input/output error"},
                             .torn = {kOther}}},
                {.call = "pwrite",
                 .outcome = {.result = -1,
                             .records = {{0xB00, "ea_eadirfs_flush"}},
                             .log = {"ea_eadirfs_flush:LINE Error: write path [{dir}/b] {error}",
                                     LOCK_LINE("0x0B00 ea_eadirfs_flush:LINE")}}},
            },
    });
}

TEST(FaultLockTest, TheRecordOfAnEADirectoryToPermissions) {
    SweepFaults({
        .name = "MAVOEACopyLock 1 to 0, by the record",
        .prepare =
            [](FaultWorld& w) {
                MakeTwoObjects(w, 0644, 0666);
                MakeResource(w, ResourceHead(0x20));
                SayLocked(false);
            },
        .run = [](FaultWorld& w) { return CopyLock(w, 1, 0); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ(0444, ModeOf(w / "b"));
                }
            },
        // Without a record nothing is locked, and "b" is writable already.
        .rules =
            Rules{
                {.call = "access"},
                {.call = "MLIBCFileStat", .outcome = {.result = -1, .log = {kNotToldLine}}},
                {.call = "stat", .outcome = {.result = -1, .log = {kNoRecordLine}}},
                {.call = "chmod",
                 .outcome = {.result = -1,
                             .records = {{0x2A00, kLockUnit}},
                             .log = {LOCK_LINE("0x2A00 ea_copy_lock:LINE")}}},
            } +
            ReadingRecordOf(kResource,
                            "ea_eadirfs_adouble_read:LINE Error: open path [{dir}/a] {error}",
                            "ea_eadirfs_adouble_read:LINE Error: read path [{dir}/a] {error}"),
    });
}

TEST(FaultLockTest, TheRecordOfOneAttributeToThatOfAnother) {
    constexpr char kReader[] = "ea_fileafs_adouble_read";
    SweepFaults({
        .name = "MAVOEACopyLock 2 to 2",
        .prepare =
            [](FaultWorld& w) {
                MakeTwoObjects(w, 0644, 0644);
                SetAttribute(w / "a", kRecord, AttributeRecord());  // locked
                Bytes record = AttributeRecord();
                PutU16(record, 372, 0x4000);
                SetAttribute(w / "b", kRecord, record);
                SayLocked(false);
            },
        .run = [](FaultWorld& w) { return CopyLock(w, 2, 2); },
        .check =
            [](FaultWorld& w, const FaultRun& run) {
                if (run.call.empty()) {
                    EXPECT_EQ(0xE0, AttributeOf(w / "b", kRecord)[372]);
                }
            },
        .rules =
            {
                {.call = "access"},
                {.call = "MLIBCFileStat", .outcome = {.result = -1, .log = {kNotToldLine}}},
                {.call = "command", .outcome = {.files = Files::kDone}},
                // No record, no lock to carry: that of "b" has none either.
                {.call = "getxattr", .errors = {ENODATA, ENOENT}},
                {.call = "getxattr",
                 .with = "{dir}/a, ",
                 .outcome = {.result = -1,
                             .records = {{0xA00, kReader}},
                             .log = {"ea_fileafs_adouble_read:LINE Error: getxattr path [{dir}/a] "
                                     "{error}",
                                     LOCK_LINE("0x0A00 ea_fileafs_adouble_read:LINE")}}},
                {.call = "getxattr",
                 .outcome = {.result = -1,
                             .records = {{0xA00, kReader}},
                             .log = {"ea_fileafs_adouble_read:LINE Error: getxattr path [{dir}/b] "
                                     "{error}",
                                     LOCK_LINE("0x0A00 ea_fileafs_adouble_read:LINE")}}},
                {.call = "setxattr",
                 .errors = {EPERM},
                 .outcome = {.result = -1,
                             .records = {{0x300, "ea_fileeafs_flush"}},
                             .log = {LOCK_LINE("0x0300 ea_fileeafs_flush:LINE")}}},
                {.call = "setxattr",
                 .outcome = {.result = -1,
                             .records = {{0xB00, "ea_fileeafs_flush"}},
                             .log = {LOCK_LINE("0x0B00 ea_fileeafs_flush:LINE")}}},
            },
    });
}

}  // namespace
}  // namespace mavoea::test

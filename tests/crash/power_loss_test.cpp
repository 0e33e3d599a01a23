// What is on disk when the power goes in the middle of an operation, and behind its success. The
// system calls are logged, and files are put together from what had been synced and any part of
// what had not.
//
// The model: bytes and sizes of a file that have not been synced may be there or not, each write
// for itself, a write also torn where two blocks of 512 bytes meet. Names, which nothing syncs, are
// changed in the order of the calls, up to any of them; syncing a file syncs the names so far. So
// it is with the journals of ext4, XFS and Btrfs.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <random>
#include <set>
#include <span>
#include <string>
#include <unordered_set>
#include <utility>
#include <vector>

#include "include/mavoea.h"
#include "platform/kernel.h"
#include "tests/crash/metadata.h"
#include "tests/crash/stream_operations.h"
#include "tests/support/fake_platform.h"
#include "tests/support/kernel_control.h"
#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

constexpr std::size_t kBlock = 512;

// All subsets of that many changes; of more, some.
constexpr std::size_t kEverySubset = 12;
constexpr int kRandomSubsets = 2000;

// The files below a directory: path to content.
using Disk = std::map<std::string, Bytes>;

Disk DiskAt(const std::string& root) {
    Disk disk;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root)) {
        if (entry.is_regular_file()) disk[entry.path().string()] = ReadFile(entry.path().string());
    }
    return disk;
}

// ---- The log ------------------------------------------------------------------------------------

// A change of a file's bytes or size, or of the names of files.
struct Event {
    FileChange change;
    int file = -1;  // which one, of those that are and were there

    bool IsSync() const {
        return change.kind == FileChange::kSynced || change.kind == FileChange::kAllSynced;
    }
    bool IsData() const {
        return change.kind == FileChange::kWritten || change.kind == FileChange::kResized;
    }
};

class Log {
 public:
    explicit Log(const std::string& root) {
        for (const auto& [path, bytes] : DiskAt(root)) {
            names_[path] = static_cast<int>(contents_.size());
            ids_[InodeOf(path)] = names_[path];
            contents_.push_back(bytes);
        }
        Hooks().fsync = [](int fd) {
            // A directory's would sync its names, which this model does not know of.
            struct stat info;
            EXPECT_EQ(0, fstat(fd, &info));
            EXPECT_FALSE(S_ISDIR(info.st_mode)) << "a directory is synced";
            return 0;
        };
        Hooks().sync = [] {};
        Hooks().changed = [this](const FileChange& change) { Add(change); };
    }
    ~Log() { Hooks().changed = nullptr; }
    Log(const Log&) = delete;
    Log& operator=(const Log&) = delete;

    const std::vector<Event>& events() const { return events_; }
    const std::map<std::string, int>& names() const { return names_; }  // before all events
    const std::vector<Bytes>& contents() const { return contents_; }

 private:
    static ino_t InodeOf(const std::string& path) {
        struct stat info;
        return lstat(path.c_str(), &info) == 0 ? info.st_ino : 0;
    }
    static ino_t InodeOf(int fd) {
        struct stat info;
        return fstat(fd, &info) == 0 ? info.st_ino : 0;
    }

    void Add(const FileChange& change) {
        Event event = {change};
        if (change.kind == FileChange::kCreated) {
            ids_[InodeOf(change.fd)] = static_cast<int>(contents_.size());
            contents_.emplace_back();
        }
        if (change.kind == FileChange::kLinked) event.file = ids_.at(InodeOf(change.to));
        if (change.fd >= 0) event.file = ids_.at(InodeOf(change.fd));
        events_.push_back(event);
    }

    std::map<std::string, int> names_;
    std::map<ino_t, int> ids_;
    std::vector<Bytes> contents_;
    std::vector<Event> events_;
};

// ---- What may be left ---------------------------------------------------------------------------

void Write(Bytes* file, std::size_t offset, std::span<const std::uint8_t> bytes) {
    file->resize(std::max(file->size(), offset + bytes.size()));
    std::copy(bytes.begin(), bytes.end(), file->begin() + static_cast<std::ptrdiff_t>(offset));
}

// A part of a write: from block boundary to block boundary of the file.
struct Part {
    std::size_t from = 0;  // of its bytes
    std::size_t to = SIZE_MAX;
};

void Apply(const Event& event, Part part, std::vector<Bytes>* contents) {
    Bytes* const file = &(*contents)[static_cast<std::size_t>(event.file)];
    const auto offset = static_cast<std::size_t>(event.change.offset);
    if (event.change.kind == FileChange::kResized) {
        file->resize(offset);
        return;
    }
    const std::span<const std::uint8_t> bytes = event.change.bytes;
    part.to = std::min(part.to, bytes.size());
    Write(file, offset + part.from, bytes.subspan(part.from, part.to - part.from));
}

void Apply(const Event& event, std::map<std::string, int>* names) {
    const FileChange& change = event.change;
    const bool named = change.kind == FileChange::kCreated && !change.path.empty();
    if (named) (*names)[change.path] = event.file;
    if (change.kind == FileChange::kLinked) (*names)[change.to] = event.file;
    if (change.kind == FileChange::kRemoved) names->erase(change.path);
    if (change.kind != FileChange::kRenamed) return;
    const auto at = names->find(change.path);
    if (at == names->end()) return;
    const int file = at->second;
    names->erase(at);
    (*names)[change.to] = file;
}

// Builds every state that a power loss can leave while the first `count` events have been made, and
// gives each to `look`.
class Losses {
 public:
    Losses(const Log& log, std::size_t count, std::function<void(const Disk&)> look)
        : look_(std::move(look)), contents_(log.contents()), names_(log.names()) {
        std::size_t names_synced = 0;
        std::vector<std::size_t> synced(contents_.size(), 0);
        for (std::size_t i = 0; i < count; ++i) {
            const Event& event = log.events()[i];
            if (event.change.kind == FileChange::kSynced) {
                synced[static_cast<std::size_t>(event.file)] = i;
            }
            if (event.change.kind == FileChange::kAllSynced) {
                std::fill(synced.begin(), synced.end(), i);
            }
            if (event.IsSync()) names_synced = i;
        }
        for (std::size_t i = 0; i < count; ++i) {
            const Event& event = log.events()[i];
            if (event.IsSync()) continue;
            if (event.IsData()) {
                if (i < synced[static_cast<std::size_t>(event.file)]) {
                    Apply(event, {}, &contents_);
                } else {
                    data_.push_back(&event);
                }
            } else if (i < names_synced) {
                Apply(event, &names_);
            } else {
                changes_.push_back(&event);
            }
        }
    }

    void VisitAll() {
        VisitSubsets();
        for (std::size_t i = 0; i < data_.size(); ++i) VisitTorn(i);
    }

 private:
    void VisitSubsets() {
        const std::size_t count = data_.size();
        if (count <= kEverySubset) {
            for (std::size_t bits = 0; bits < std::size_t{1} << count; ++bits) {
                Visit([&](std::size_t i) { return (bits >> i & 1) != 0; });
            }
            return;
        }
        for (std::size_t end = 0; end <= count; ++end) {
            Visit([&](std::size_t i) { return i < end; });
        }
        std::minstd_rand random(5);
        for (int i = 0; i < kRandomSubsets; ++i) {
            Visit([&](std::size_t) { return (random() >> 8 & 1) != 0; });
        }
    }

    void VisitTorn(std::size_t torn) {
        const FileChange& change = data_[torn]->change;
        if (change.kind != FileChange::kWritten) return;
        const auto offset = static_cast<std::size_t>(change.offset);
        const std::size_t end = offset + change.bytes.size();
        for (std::size_t at = (offset / kBlock + 1) * kBlock; at < end; at += kBlock) {
            for (const Part part : {Part{0, at - offset}, Part{at - offset}}) {
                Visit([](std::size_t) { return false; }, torn, part);
                Visit([&](std::size_t i) { return i < torn; }, torn, part);
                Visit([](std::size_t) { return true; }, torn, part);
            }
        }
    }

    // The state with those of the unsynced bytes for which `made` is true, and with part of one.
    template <class Made>
    void Visit(Made made, std::size_t torn = SIZE_MAX, Part part = {}) {
        std::vector<Bytes> contents = contents_;
        for (std::size_t i = 0; i < data_.size(); ++i) {
            if (i == torn) {
                Apply(*data_[i], part, &contents);
            } else if (made(i)) {
                Apply(*data_[i], {}, &contents);
            }
        }
        std::map<std::string, int> names = names_;
        for (std::size_t i = 0;; ++i) {
            Disk disk;
            for (const auto& [path, file] : names) {
                disk[path] = contents[static_cast<std::size_t>(file)];
            }
            look_(disk);
            if (i == changes_.size()) break;
            Apply(*changes_[i], &names);
        }
    }

    std::function<void(const Disk&)> look_;
    std::vector<Bytes> contents_;
    std::map<std::string, int> names_;
    std::vector<const Event*> data_;
    std::vector<const Event*> changes_;
};

// ---- Operations ---------------------------------------------------------------------------------

// An operation, and what a power loss can leave: while it runs, and once it has said that it is
// done. What it can leave then is the new state alone, but for the operations that say otherwise.
struct Operation {
    std::string name;
    std::function<void(const ObjectFiles&)> prepare;
    std::function<int(const ObjectFiles&)> run;
    std::function<Cost(const ObjectFiles&)> cost;
    std::string during;
    std::string after = "new";
};

// What all states together can cost: the outcomes, and whatever is lost in one of them.
class Costs {
 public:
    void Add(const Cost& cost) {
        outcomes_.insert(cost.outcome);
        lost_.insert(cost.lost.begin(), cost.lost.end());
    }
    std::string Text() const { return Cost{Listed(outcomes_), lost_}.Text(); }

 private:
    std::set<std::string> outcomes_;
    std::set<std::string> lost_;
};

// A directory that takes on one state after the other.
class Replica {
 public:
    explicit Replica(std::string root) : root_(std::move(root)), now_(DiskAt(root_)) {}

    void Become(const Disk& disk) {
        for (const auto& [path, bytes] : now_) {
            if (!disk.contains(path) && unlink(path.c_str()) != 0) abort();
        }
        for (const auto& [path, bytes] : disk) {
            const auto at = now_.find(path);
            if (at != now_.end() && at->second == bytes) continue;
            const std::string parent = path.substr(0, path.rfind('/'));
            if (!Exists(parent)) std::filesystem::create_directories(parent);
            const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0666);
            const auto size = static_cast<ssize_t>(bytes.size());
            if (fd < 0 || ::write(fd, bytes.data(), bytes.size()) != size) abort();
            ::close(fd);
        }
        now_ = disk;
    }

 private:
    std::string root_;
    Disk now_;
};

std::string KeyOf(const Disk& disk) {
    std::string key;
    for (const auto& [path, bytes] : disk) {
        key += path + "\n" + std::to_string(bytes.size()) + "\n";
        key.append(bytes.begin(), bytes.end());
    }
    return key;
}

void LosePower(const Operation& operation) {
    SCOPED_TRACE(operation.name);
    ResetKernel();
    ResetPlatform();
    const TempDir dir(FastDirectory());
    const ObjectFiles object = {dir / "share", "object"};
    MakeDir(object.parent);
    MakeDir(object.ea_dir());
    object.MakeObject();
    operation.prepare(object);

    Hooks().archive = [](int) { return 0; };
    Hooks().command = [](const char*, int) { return 0; };
    Log log(object.parent);
    EXPECT_EQ(0, operation.run(object));
    Hooks().changed = nullptr;
    // The whole log leads to what is there now.
    EXPECT_EQ("new", operation.cost(object).Text());

    Replica replica(object.parent);
    std::unordered_set<std::string> seen;
    Costs during;
    Costs after;
    Costs* costs = &during;
    const auto look = [&](const Disk& disk) {
        if (!seen.insert((costs == &after ? "after" : "during") + KeyOf(disk)).second) return;
        replica.Become(disk);
        ReadEverything(object.parent);
        costs->Add(operation.cost(object));
        (void)TakeCallNames();
        (void)TakeLog();
    };
    // Between two syncs, the time just before the second has all that any other has.
    const std::size_t count = log.events().size();
    for (std::size_t i = 0; i < count; ++i) {
        if (log.events()[i].IsSync()) Losses(log, i, look).VisitAll();
    }
    Losses(log, count, look).VisitAll();
    EXPECT_EQ(operation.during, during.Text());
    costs = &after;
    Losses(log, count, look).VisitAll();
    EXPECT_EQ(operation.after, after.Text());
    printf("power loss: %s: %zu states\n", operation.name.c_str(), seen.size());
    ResetKernel();
    ResetPlatform();
}

// ---- Streams ------------------------------------------------------------------------------------

Operation OnStream(const StreamOperation& operation, const std::string& during) {
    const auto on_file = [](const ObjectFiles& object, const std::function<int(int)>& run) {
        const int fd = ::open(object.stream().c_str(), O_RDWR);
        const int result = run(fd);
        ::close(fd);
        return result;
    };
    return {
        .name = operation.name,
        .prepare = [=](const ObjectFiles& object) { WriteFile(object.stream(), operation.before); },
        .run = [=](const ObjectFiles& object) { return on_file(object, operation.run); },
        .cost =
            [=](const ObjectFiles& object) {
                Cost cost;
                (void)on_file(object, [&](int fd) {
                    cost = CostOfStream(operation, fd);
                    return 0;
                });
                return cost;
            },
        .during = during,
    };
}

// Every value and the fork have several blocks.
constexpr std::size_t kSize = 1500;
constexpr std::size_t kFork = 20000;

// Promise: "What a crash costs: `tests/crash/power_loss_test.cpp` puts"
// Promise: "A loss of power: a new stream"
// Promise: "A loss of power: write, overwrite"
// Promise: "A loss of power: Names have no sync"
TEST(PowerLossTest, AChangeOfAStreamMayCostAnyOfItsValues) {
    LosePower(OnStream(WriteToAnEmptyFile(), "new, old"));
    LosePower(OnStream(WriteOf("write a new attribute", kSize, 0, std::nullopt, 1000),
                       "LOST the value, new, old; LOST a, c"));
    LosePower(OnStream(WriteOf("overwrite an attribute", kSize, 0, kSize, kSize),
                       "LOST the value, new, old; LOST c"));
    LosePower(OnStream(WriteOf("make an attribute longer", kSize, 0, kSize, 2000),
                       "LOST the value, new, old; LOST c"));
    LosePower(OnStream(TruncationOf("make an attribute shorter", kSize, 0, 700),
                       "LOST the value, new, old; LOST c"));
    LosePower(OnStream(ReplacementOf("replace an attribute by a longer one", kSize, 0, 2000),
                       "LOST the value, new, old; LOST c"));
    LosePower(OnStream(ReplacementOf("replace an attribute by a shorter one", kSize, 0, 700),
                       "LOST the value, new, old; LOST c"));
    LosePower(OnStream(RemovalOf("remove an attribute", kSize, 0),
                       "LOST the value, new, old; LOST a, c"));
}

// Promise: "What a crash costs: In every state that they reach"
// Promise: "A loss of power: the same before"
TEST(PowerLossTest, AChangeOfAStreamBeforeAForkMayCostTheForkToo) {
    LosePower(
        OnStream(WriteOf("write a new attribute before a fork", kSize, kFork, std::nullopt, 1000),
                 "LOST the value, new, old; LOST a, c, fork"));
    LosePower(OnStream(WriteOf("overwrite an attribute before a fork", kSize, kFork, kSize, kSize),
                       "LOST the value, new, old; LOST c"));
    LosePower(OnStream(WriteOf("make an attribute before a fork longer", kSize, kFork, kSize, 2000),
                       "LOST the value, new, old; LOST c, fork"));
    LosePower(OnStream(TruncationOf("make an attribute before a fork shorter", kSize, kFork, 700),
                       "LOST the value, new, old; LOST c, fork"));
    LosePower(OnStream(ReplacementOf("replace one by a longer one", kSize, kFork, 2000),
                       "LOST the value, new, old; LOST c, fork"));
    LosePower(OnStream(ReplacementOf("replace one by a shorter one", kSize, kFork, 700),
                       "LOST the value, new, old; LOST c, fork"));
    LosePower(OnStream(RemovalOf("remove an attribute before a fork", kSize, kFork),
                       "LOST the value, new, old; LOST a, c, fork"));
}

TEST(PowerLossTest, AnOverwriteInALargeStreamCostsNothingBeforeWhatIsWritten) {
    constexpr std::size_t kLarge = 30000;
    LosePower(
        OnStream(WriteOf("overwrite an attribute of a large stream", kLarge, 0, kLarge, kLarge),
                 "LOST the value, new, old; LOST c"));
    LosePower(OnStream(WriteOfLast("overwrite the last of a large stream", kLarge, 0, kLarge),
                       "LOST the value, new, old"));
    LosePower(OnStream(WriteOfLast("overwrite the last before a fork", kLarge, kFork, kLarge),
                       "LOST the value, new, old"));
}

// What services do that write a stream's fork: its bytes first, then its length.
int WriteFork(int fd, const Bytes& fork) {
    const Stream stream(fd);
    const auto at = static_cast<off_t>(U32At({stream.get()->header, 120}, kForkOffsetAt));
    if (kernel::Pwrite(fd, fork.data(), fork.size(), at) != static_cast<ssize_t>(fork.size())) {
        return -1;
    }
    PutU32({stream.get()->header, 120}, kForkLengthAt, fork.size());
    if (MAVOEASWriteHeader(stream.get()) != 0) return -1;
    if (kernel::Ftruncate(fd, at + static_cast<off_t>(fork.size())) != 0) return -1;
    return MAVOEASFlush(stream.get());
}

// The fork is what is written: old, new, or lost.
StreamOperation ForkWriteOf(const std::string& name, std::size_t old_size, std::size_t new_size) {
    const StreamImage image = ThreeAttributes(kSize, old_size);
    StreamOperation operation;
    operation.name = name;
    operation.before = image.Build();
    operation.wanted = OthersOf(image, kForkItem);
    operation.old_value = image.fork;
    operation.new_value = Pattern(new_size, 0x77);
    operation.item = kForkItem;
    operation.run = [fork = *operation.new_value](int fd) { return WriteFork(fd, fork); };
    return operation;
}

// Promise: "A loss of power: a fork, written"
TEST(PowerLossTest, AWriteOfTheForkCostsNothingElse) {
    LosePower(OnStream(ForkWriteOf("write a fork", 0, 5000), "LOST the value, new, old"));
    LosePower(OnStream(ForkWriteOf("make a fork longer", 3000, 5000), "LOST the value, new, old"));
    LosePower(OnStream(ForkWriteOf("make a fork shorter", 5000, 3000), "LOST the value, new, old"));
}

// ---- Resource files -----------------------------------------------------------------------------

const Bytes& OldFinderInfo() {
    static const Bytes& bytes = *new Bytes(Pattern(32, 0x40));
    return bytes;
}
const Bytes& NewFinderInfo() {
    static const Bytes& bytes = *new Bytes(Pattern(32, 0x11));
    return bytes;
}
const Bytes& Fork() {
    static const Bytes& bytes = *new Bytes(Pattern(3000, 4));
    return bytes;
}

Cost CostOfFinderInfo(const ObjectFiles& object) {
    if (!Exists(object.resource())) return {"no file"};
    if (ReadFile(object.resource()).empty()) return {"empty file"};
    const Items items = ItemsOfMacFile(object.resource());
    if (items.empty()) return {"REFUSED"};
    Cost cost = {items.at(kFinderItem) == OldFinderInfo()   ? "old"
                 : items.at(kFinderItem) == NewFinderInfo() ? "new"
                                                            : "LOST Finder info"};
    if (items.at(kForkItem) != Fork() && !items.at(kForkItem).empty()) cost.lost.insert(kForkItem);
    return cost;
}

int WriteFinderInfo(const ObjectFiles& object) {
    return MAVOEAEADirFSFInfoWrite(object.object().c_str(), NewFinderInfo().data());
}

// Nothing syncs it: that is left to the caller.
// Promise: "A loss of power: Finder info"
TEST(PowerLossTest, FinderInfoThatHasBeenWrittenMayNotBeThere) {
    LosePower({
        .name = "write Finder info",
        .prepare =
            [](const ObjectFiles& object) {
                WriteFile(object.resource(), PlainAppleDouble(OldFinderInfo(), Fork()));
            },
        .run = WriteFinderInfo,
        .cost = CostOfFinderInfo,
        .during = "new, old",
        .after = "new, old",
    });
    LosePower({
        .name = "write Finder info to a new file",
        .prepare = [](const ObjectFiles&) {},
        .run = WriteFinderInfo,
        .cost = CostOfFinderInfo,
        .during = "empty file, new, no file",
        .after = "empty file, new, no file",
    });
}

// The record replaces the head of the file, in two blocks; nothing syncs it.
// Promise: "A loss of power: Finder info"
TEST(PowerLossTest, ARecordThatHasBeenWrittenMayNotBeThere) {
    const Bytes former = OneEntry(9, 122, 32);
    const Bytes record = Pattern(741, 0x77);
    LosePower({
        .name = "write a netatalk record",
        .prepare = [=](const ObjectFiles& object) { WriteFile(object.resource(), former); },
        .run =
            [=](const ObjectFiles& object) {
                return MAVOEAEADirAdoubleFlush(record.data(), static_cast<int>(record.size()),
                                               object.object().c_str());
            },
        .cost = [=](const ObjectFiles& object) -> Cost {
            const Bytes now = ReadFile(object.resource());
            return {now == record ? "new" : now == former ? "old" : "LOST record"};
        },
        .during = "LOST record, new, old",
        .after = "LOST record, new, old",
    });
}

// ---- Objects ------------------------------------------------------------------------------------

Items Attributes() { return {{"user.one", Pattern(700, 1)}, {"user.two", Pattern(50, 2)}}; }

StreamImage ImageOf(const Items& attributes) {
    StreamImage image;
    for (const auto& [name, value] : attributes) image.attributes.push_back({name, value});
    return image;
}

// Values of several blocks each, but for one.
Items LegacyAttributes() {
    return {{"user.one", Pattern(1700, 1)},
            {"user.two", Pattern(50, 2)},
            {"user.three", Pattern(6000, 3)}};
}

Items InFolder(const ObjectFiles& object) {
    Items items;
    for (const auto& [name, value] : LegacyAttributes()) {
        const std::string file = object.folder() + "/" + name;
        if (Exists(file)) items[name] = ReadFile(file);
    }
    return items;
}

Items InStream(const ObjectFiles& object) {
    return Exists(object.stream()) ? LookAtStream(object.stream()).items : Items{};
}

// Wanted items that are nowhere.
std::set<std::string> LostFrom(const Items& wanted, const std::vector<Items>& places) {
    std::set<std::string> lost;
    for (const auto& [name, value] : wanted) lost.insert(name);
    for (const Items& place : places) {
        for (const std::string& name : WholeIn(place, wanted)) lost.erase(name);
    }
    return lost;
}

// What reads the object's stream has it converted first.
int OpenStream(const ObjectFiles& object) {
    const int fd = MAVOEAOpen(EA_FORM_FILE, object.object().c_str(), MAVOEA_KIND_STREAM, O_RDWR,
                              EA_PLACE_EADIR);
    ::close(fd);
    return fd < 0 ? -1 : 0;
}

// Promise: "A loss of power: import"
TEST(PowerLossTest, AnImportOnOpenLosesNothing) {
    LosePower({
        .name = "import an AppleDouble file on open",
        .prepare =
            [](const ObjectFiles& object) {
                StreamImage image = ImageOf(Attributes());
                image.fork = Fork();
                WriteFile(object.sidecar(), image.Build());
            },
        .run = OpenStream,
        .cost = [](const ObjectFiles& object) -> Cost {
            Items wanted = Attributes();
            wanted[kForkItem] = Fork();
            const Items former = ItemsOfMacFile(object.sidecar());
            const Items now = InStream(object);
            return {WholeIn(now, wanted).size() == wanted.size() ? "new" : "old",
                    LostFrom(wanted, {former, now})};
        },
        .during = "new, old",
        .after = "new, old",  // of the old state the next open makes the new one
    });
}

// Promise: "A loss of power: upgrade"
// Promise: "A loss of power: Names have no sync"
TEST(PowerLossTest, AnUpgradeOfAttributeFilesIsDoneOrNot) {
    LosePower({
        .name = "upgrade of attribute files",
        .prepare =
            [](const ObjectFiles& object) {
                object.MakeFolder();
                for (const auto& [name, value] : LegacyAttributes()) {
                    WriteFile(object.folder() + "/" + name, value);
                }
            },
        .run =
            [](const ObjectFiles& object) {
                return MAVOEAUpgrade(object.object().c_str(), MAVOEA_KIND_STREAM);
            },
        .cost = [](const ObjectFiles& object) -> Cost {
            const Items wanted = LegacyAttributes();
            const Items now = InStream(object);
            const auto whole = WholeIn(now, wanted).size();
            return {whole == wanted.size()     ? "new"
                    : !Exists(object.stream()) ? "old"
                                               : "in part",
                    LostFrom(wanted, {InFolder(object), now})};
        },
        .during = "new, old",
    });
}

Items WantedItems() {
    Items wanted = Attributes();
    wanted[kFinderItem] = OldFinderInfo();
    wanted[kForkItem] = Fork();
    return wanted;
}

Bytes ResourceWithAttributes() {
    StreamImage image = ImageOf(Attributes());
    image.finder_info = OldFinderInfo();
    image.fork = Fork();
    return image.Build();
}

// The attributes wherever they are, Finder info and fork in the resource file.
Cost CostOfRepair(const ObjectFiles& object) {
    const Items wanted = WantedItems();
    const Items resource = ItemsOfMacFile(object.resource());
    Items moved = InStream(object);
    moved.erase(kFinderItem);
    moved.erase(kForkItem);
    const bool all_moved = WholeIn(moved, Attributes()).size() == Attributes().size();
    const bool plain = !resource.empty() && WholeIn(resource, Attributes()).empty();
    return {all_moved && plain ? "new"
            : resource.empty() ? "REFUSED"
                               : "old",
            LostFrom(wanted, {resource, moved})};
}

// Promise: "A loss of power: repair"
TEST(PowerLossTest, ARepairCostsNothing) {
    LosePower({
        .name = "repair of a resource file",
        .prepare =
            [](const ObjectFiles& object) {
                WriteFile(object.resource(), ResourceWithAttributes());
            },
        .run = [](const ObjectFiles& object) { return MAVOEAFixErrorAD(object.object().c_str()); },
        .cost = CostOfRepair,
        .during = "new, old",
        .after = "new, old",
    });
}

// ---- Copies and moves ---------------------------------------------------------------------------

Items Found(const ObjectFiles& object, int type) {
    if (type == 0) return ItemsOfMacFile(object.sidecar());
    Items items = InStream(object);
    for (const char* const item : {kFinderItem, kForkItem}) items.erase(item);
    items.merge(ItemsOfMacFile(object.resource()));
    return items;
}

// As /bin/cp writes a file, which it does not sync either; through calls that are logged.
int CopyFile(const std::vector<std::string>& argv) {
    if (argv.size() != 4 || argv[0] != "/bin/cp") return -1;
    const Bytes bytes = ReadFile(argv[2]);
    const int fd = kernel::Open(argv[3].c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0666);
    const ssize_t put = kernel::Pwrite(fd, bytes.data(), bytes.size(), 0);
    ::close(fd);
    return put == static_cast<ssize_t>(bytes.size()) ? 0 : 1;
}

// To an object of the same directory, "copy".
Operation CopyOf(int from, int to, bool move, const std::string& during, const std::string& after) {
    const auto target = [](const ObjectFiles& object) {
        return ObjectFiles{object.parent, "copy"};
    };
    return {
        .name = std::string(move ? "move" : "copy") + " from type " + std::to_string(from) +
                " to type " + std::to_string(to),
        .prepare =
            [=](const ObjectFiles& object) {
                if (from == 0) {
                    WriteFile(object.sidecar(), ResourceWithAttributes());
                } else {
                    WriteFile(object.stream(), ImageOf(Attributes()).Build());
                    WriteFile(object.resource(), PlainAppleDouble(OldFinderInfo(), Fork()));
                }
                target(object).MakeObject();
                Platform().exec = CopyFile;
            },
        .run =
            [=](const ObjectFiles& object) {
                std::string copy = target(object).object();
                return MAVOEACopy(object.object().c_str(), copy.data(), move ? 1 : 0, 0, from, to,
                                  0, 0);
            },
        .cost = [=](const ObjectFiles& object) -> Cost {
            const Items wanted = WantedItems();
            const Items former = Found(object, from);
            const Items now = Found(target(object), to);
            const bool all_there = WholeIn(now, wanted).size() == wanted.size();
            const bool all_left = WholeIn(former, wanted).size() == wanted.size();
            return {all_there ? "new" : all_left ? "old" : "half", LostFrom(wanted, {former, now})};
        },
        .during = during,
        .after = after,
    };
}

// Once it has succeeded a copy may be incomplete: its source is still there.
// Promise: "A loss of power: copy"
// Promise: "A loss of power: Names have no sync"
TEST(PowerLossTest, ACopyMayBeIncompleteBehindItsSuccessButItsSourceIsNot) {
    LosePower(CopyOf(0, 0, false, "new, old", "new, old"));
    LosePower(CopyOf(0, 1, false, "new, old", "new, old"));
    LosePower(CopyOf(1, 0, false, "new, old", "new"));
    LosePower(CopyOf(1, 1, false, "new, old", "new, old"));
    LosePower(CopyOf(1, 2, false, "new, old", "new, old"));
}

// Promise: "A loss of power: move"
TEST(PowerLossTest, AMoveRemovesItsSourceBeforeItsCopyHasBeenSynced) {
    LosePower(CopyOf(0, 0, true, "half, new, old; LOST Finder info, fork, user.one, user.two",
                     "half, new, old; LOST Finder info, fork, user.one, user.two"));
    LosePower(CopyOf(0, 1, true, "half, new, old; LOST Finder info, fork",
                     "half, new, old; LOST Finder info, fork"));
    LosePower(CopyOf(1, 0, true, "half, new, old; LOST Finder info, fork", "new"));
    LosePower(CopyOf(1, 1, true, "half, new, old; LOST Finder info, fork, user.one, user.two",
                     "half, new, old; LOST Finder info, fork, user.one, user.two"));
    LosePower(CopyOf(1, 2, true, "half, new, old; LOST Finder info, fork, user.one, user.two",
                     "half, new, old; LOST Finder info, fork, user.one, user.two"));
}

// ---- Renames and removals -----------------------------------------------------------------------

ObjectFiles Renamed(const ObjectFiles& object) { return {object.parent, "renamed"}; }

void FillObject(const ObjectFiles& object, int type) {
    if (type == 0) {
        WriteFile(object.sidecar(), ResourceWithAttributes());
    } else {
        WriteFile(object.stream(), ImageOf(Attributes()).Build());
        WriteFile(object.resource(), PlainAppleDouble(OldFinderInfo(), Fork()));
    }
}

// The caller has renamed the object before.
Operation RenameOf(int type, const std::string& left) {
    return {
        .name = "rename, type " + std::to_string(type),
        .prepare =
            [=](const ObjectFiles& object) {
                FillObject(object, type);
                std::filesystem::rename(object.object(), Renamed(object).object());
            },
        .run =
            [=](const ObjectFiles& object) {
                return MAVOEARename(object.object().c_str(), Renamed(object).object().c_str(), type,
                                    nullptr);
            },
        .cost = [=](const ObjectFiles& object) -> Cost {
            const Items wanted = WantedItems();
            const Items former = Found(object, type);
            const Items now = Found(Renamed(object), type);
            const auto under_new = WholeIn(now, wanted).size();
            return {under_new == wanted.size() ? "new"
                    : under_new == 0           ? "old"
                                               : "some names old",
                    LostFrom(wanted, {former, now})};
        },
        .during = left,
        .after = left,
    };
}

// Of an object that the caller has removed before.
Operation RemovalOf(int type, const std::string& left) {
    return {
        .name = "remove, type " + std::to_string(type),
        .prepare =
            [=](const ObjectFiles& object) {
                FillObject(object, type);
                std::filesystem::remove(object.object());
            },
        .run =
            [=](const ObjectFiles& object) {
                return MAVOEARemove(object.object().c_str(), type, nullptr);
            },
        .cost = [=](const ObjectFiles& object) -> Cost {
            const auto there = WholeIn(Found(object, type), WantedItems()).size();
            return {there == 0 ? "new" : there == WantedItems().size() ? "old" : "some names old"};
        },
        .during = left,
        .after = left,
    };
}

// Promise: "A loss of power: Names have no sync"
// Promise: "A loss of power: rename, remove"
TEST(PowerLossTest, WhatARenameOrARemovalHasDoneMayNotBeThere) {
    LosePower(RenameOf(0, "new, old"));
    LosePower(RenameOf(1, "new, old, some names old"));
    LosePower(RemovalOf(0, "new, old"));
    LosePower(RemovalOf(1, "new, old, some names old"));
}

}  // namespace
}  // namespace mavoea::test

#include "tests/support/stream_exercise.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <utility>

#include "platform/include/mavocore.h"
#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

constexpr std::size_t kMostBytes = 300'000;

// What values and forks are cut from.
const Bytes& Material() {
    static const Bytes& bytes = *new Bytes(Pattern(kMostBytes + 4096, 77));
    return bytes;
}

const std::vector<std::string>& Names() {
    static const auto& names = *new std::vector<std::string>{"",
                                                             "a",
                                                             "b",
                                                             "user.comment",
                                                             "com.apple.metadata:_kMDItemUserTags",
                                                             "com.apple.quarantine",
                                                             "\xC3\xA4",
                                                             "eighth",
                                                             std::string(240, 'l'),
                                                             std::string(241, 'm'),
                                                             std::string(254, 'n'),
                                                             std::string(255, 'o'),
                                                             std::string(600, 'p')};
    return names;
}

template <class Value>
std::string Number(Value value) {
    return std::to_string(value);
}

std::string Shown(const std::string& name) {
    return name.size() > 20 ? name.substr(0, 3) + "*" + Number(name.size()) : "\"" + name + "\"";
}

}  // namespace

StreamExercise::StreamExercise(Surroundings surroundings) : around_(std::move(surroundings)) {
    fd_ = memfd_create("stream", MFD_CLOEXEC);
    if (fd_ < 0) abort();
    other_fd_ = ::open(("/proc/self/fd/" + Number(fd_)).c_str(), O_RDWR | O_CLOEXEC);
    if (other_fd_ < 0) abort();
}

StreamExercise::~StreamExercise() {
    if (handle_ != nullptr) MAVOEASClose(handle_);
    close(other_fd_);
    close(fd_);
}

template <class Function>
auto StreamExercise::Call(std::size_t bytes, Function function) {
    // The largest blocks are the table in memory, up to three times what it takes on disk, and the
    // image of what is written.
    const std::size_t most = 3 * (model_ ? model_->file().size() : 0) + bytes + 65536;
    if (around_.before_call) around_.before_call();
    errno = 0;
    const auto result = function();
    errno_ = errno;
    if (around_.after_call) around_.after_call(most);
    return result;
}

// ---- The file -----------------------------------------------------------------------------------

const Bytes& StreamExercise::FileBytes() {
    struct stat info;
    if (fstat(fd_, &info) != 0) abort();
    // No operation makes more of a file than was there and was written.
    const auto size = static_cast<std::size_t>(std::min<off_t>(info.st_size, 64 << 20));
    file_bytes_.resize(size);
    if (pread(fd_, file_bytes_.data(), size, 0) != static_cast<ssize_t>(size)) abort();
    return file_bytes_;
}

void StreamExercise::Refill(std::span<const std::uint8_t> bytes) const {
    if (ftruncate(fd_, 0) != 0) abort();
    if (pwrite(fd_, bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) abort();
}

// ---- Opening and closing ------------------------------------------------------------------------

std::string StreamExercise::Begin(std::span<const std::uint8_t> file) {
    Refill(file);
    last_ = "open";
    return Open();
}

std::string StreamExercise::Open() {
    static constexpr int kLocks[] = {F_WRLCK, F_WRLCK, F_WRLCK, F_WRLCK,
                                     F_WRLCK, F_WRLCK, F_RDLCK, F_UNLCK};
    const int lock_type = kLocks[Below(std::size(kLocks))];
    model_.emplace(FileBytes(), lock_type);
    handle_ = Call(0, [&] { return MAVOEASOpen(fd_, lock_type); });
    const std::vector<int> codes = around_.take_codes();
    if (model_->refused() != 0) {
        if (handle_ != nullptr) return "a stream was opened that is to be refused";
        if (codes != std::vector{model_->refused()}) return "it was refused with another code";
        model_->LockSet(F_UNLCK);
        if (std::string fault = CheckLock(); !fault.empty()) return fault;
        return CheckFile();
    }
    if (handle_ == nullptr) return "a stream was refused that is to be opened";
    if (!codes.empty()) return "opening recorded a code";
    if (handle_->fd != fd_) return "the handle has another descriptor";
    if (std::string fault = model_->CompareHandle(*handle_); !fault.empty()) return fault;
    if (std::string fault = CheckLock(); !fault.empty()) return fault;
    return CheckFile();
}

std::string StreamExercise::End() {
    if (handle_ == nullptr) return {};
    const int result = Call(0, [&] { return MAVOEASClose(handle_); });
    handle_ = nullptr;
    if (result != 0 || !around_.take_codes().empty()) return "it could not be closed";
    model_->LockSet(F_UNLCK);
    return CheckLock();
}

std::string StreamExercise::Reopen() {
    if (std::string fault = End(); !fault.empty()) return fault;
    return Open();
}

// ---- Comparing ----------------------------------------------------------------------------------

std::string StreamExercise::CheckFile() { return model_->CompareFile(FileBytes()); }

// The lock that the kernel has is the one that the handle is said to have.
std::string StreamExercise::CheckLock() {
    struct flock lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    if (fcntl(other_fd_, F_OFD_GETLK, &lock) != 0) return {};  // Not every emulator can tell.
    if (lock.l_type == model_->lock_type()) return {};
    return "the file has lock " + Number(lock.l_type);
}

std::string StreamExercise::Check(int result, int error, const Outcome& outcome) {
    const std::vector<int> codes = around_.take_codes();
    if (outcome.unsure && result == -1) {
        if (codes.size() == 1 && (codes[0] == 0xA00 || codes[0] == 0xD00)) return {};
        return "a refusal recorded " + Number(codes.size()) + " codes, " +
               Number(codes.empty() ? 0 : codes[0]);
    }
    if (result != outcome.result) {
        return "the result is " + Number(result) + " and not " + Number(outcome.result) +
               (codes.empty() ? "" : ", code " + Number(codes[0]));
    }
    const std::vector<int> expected =
        outcome.code == 0 ? std::vector<int>{} : std::vector{outcome.code};
    if (codes != expected) {
        return "recorded are " + Number(codes.size()) + " codes, " +
               Number(codes.empty() ? 0 : codes[0]) + ", and not " + Number(outcome.code);
    }
    if (outcome.error != 0 && error != outcome.error) return "errno is " + Number(error);
    return {};
}

// After a call that may have changed the stream, with a model that knows.
std::string StreamExercise::AfterChange(const Outcome& outcome, int result) {
    if (std::string fault = Check(result, errno_, outcome); !fault.empty()) return fault;
    if (std::string fault = CheckFile(); !fault.empty()) return fault;
    if (!model_->exact()) return {};
    return model_->CompareHandle(*handle_);
}

// After a change that the model was unsure of: either it was refused and nothing has changed on
// disk, or it was done and the attributes are these.
std::string StreamExercise::AfterUnsure(const StreamModel::Contents& expected, bool done) {
    if (!done) {
        if (FileBytes() != model_->file()) return "a refused call has changed the file";
        return Reopen();
    }
    if (expected.known) {
        const std::size_t count = expected.names.size();
        for (std::size_t i = 0; i < count; ++i) {
            // Of two of the same name only the last can be read.
            const auto same = std::find(expected.names.begin() + static_cast<std::ptrdiff_t>(i) + 1,
                                        expected.names.end(), expected.names[i]);
            if (same != expected.names.end()) continue;
            const char* const name = expected.names[i].c_str();
            if (MAVOEASSearch(handle_, name) != static_cast<int>(i)) return "the order is another";
            Bytes value(expected.values[i].size() + 1);
            const int length =
                MAVOEASRead(handle_, name, value.data(), static_cast<unsigned>(value.size()), 0);
            if (length < 0) return "a value cannot be read any more";
            value.resize(static_cast<std::size_t>(length));
            if (value != expected.values[i]) return "a value is another";
        }
    }
    if (FileBytes().size() > 2 * model_->file().size() + kMostBytes + 65536) {
        return "the file is too long";
    }
    return Reopen();
}

// ---- Choosing -----------------------------------------------------------------------------------

std::string StreamExercise::SomeName() {
    const std::vector<ModelAttribute>& there = model_->attributes();
    if (!there.empty() && Below(3) == 0) {
        return there[Below(static_cast<unsigned>(there.size()))].name.c_str();
    }
    return Names()[Below(static_cast<unsigned>(Names().size()))];
}

unsigned StreamExercise::SomeSize() {
    switch (Below(32)) {
        case 0:
            return Below(5000);
        case 1:
            return Below(256) == 0 ? Below(kMostBytes) : 16000 + Below(800);
        default:
            return Below(40);
    }
}

std::span<const std::uint8_t> StreamExercise::SomeBytes() {
    const unsigned size = SomeSize();
    return std::span(Material()).subspan(Below(4096), size);
}

// ---- Operations ---------------------------------------------------------------------------------

std::string StreamExercise::DoSearch() {
    const std::string name = SomeName();
    last_ = "search " + Shown(name);
    const int result = Call(0, [&] { return MAVOEASSearch(handle_, name.c_str()); });
    return Check(result, errno_, model_->Search(name));
}

std::string StreamExercise::DoEnum() {
    last_ = "enum";
    MLIBCSzList* list = MLIBCSzListAlloc(0);
    errno = 0;
    const int result = MAVOEASEnum(handle_, &list);
    std::vector<std::string> names;
    std::string fault = Check(result, errno, model_->Enum(&names));
    for (std::size_t i = 0; fault.empty() && i <= names.size(); ++i) {
        const char* const name = MLIBCSzListGet(list, static_cast<int>(i));
        if ((name == nullptr) != (i == names.size())) {
            fault = "the list has another number of names";
        } else if (name != nullptr && names[i] != name) {
            fault = "name " + Number(i) + " of the list is another";
        }
    }
    MLIBCSzListFree(list);
    return fault;
}

std::string StreamExercise::DoRead() {
    const std::string name = SomeName();
    const unsigned size = Below(4) == 0 ? 0 : SomeSize();
    const unsigned offset = Below(2) == 0 ? 0 : Below(64) == 0 ? ~Below(8) : SomeSize();
    last_ = "read " + Shown(name) + " " + Number(size) + " at " + Number(offset);
    Bytes expected;
    const Outcome outcome = model_->Read(name, size, offset, &expected);
    Bytes found(std::size_t{size} + 1, 0xA5);
    const int result =
        Call(0, [&] { return MAVOEASRead(handle_, name.c_str(), found.data(), size, offset); });
    if (std::string fault = Check(result, errno_, outcome); !fault.empty()) return fault;
    if (!std::equal(expected.begin(), expected.end(), found.begin())) return "other bytes are read";
    return found[size] == 0xA5 ? "" : "more was read than there was room for";
}

std::string StreamExercise::DoWrite() {
    const std::string name = SomeName();
    const std::span<const std::uint8_t> data = SomeBytes();
    const auto size = static_cast<unsigned>(data.size());
    // Some offsets that nothing can be written at.
    const unsigned offset = Below(3) != 0 ? 0 : Below(64) == 0 ? ~Below(8) : SomeSize();
    static constexpr int kFlags[] = {1, 1, 1, 1, 0, 2, 3, 3};
    const int flags = kFlags[Below(std::size(kFlags))];
    last_ = "write " + Shown(name) + " " + Number(size) + " at " + Number(offset) + ", flags " +
            Number(flags);

    const bool exact = model_->exact();
    StreamModel::Contents contents;
    if (!exact) contents = model_->ContentsNow();
    const int index = model_->Find(name);
    const Outcome outcome = model_->Write(name, data, offset, flags);
    const std::size_t most = outcome.code != 0 ? 0 : std::size_t{offset} + size;
    const int result = Call(most, [&] {
        return MAVOEASWrite(handle_, name.c_str(), data.data(), size, offset, flags);
    });
    if (!outcome.unsure) {
        if (std::string fault = AfterChange(outcome, result); !fault.empty()) return fault;
        const bool done = outcome.result >= 0 && outcome.error == 0;
        return done && model_->whole() ? LayoutFault(model_->file()) : "";
    }
    if (std::string fault = Check(result, errno_, outcome); !fault.empty()) return fault;
    if (contents.known && result >= 0) {
        Bytes value;
        if (index >= 0) {
            value = contents.values[static_cast<std::size_t>(index)];
            contents.names.erase(contents.names.begin() + index);
            contents.values.erase(contents.values.begin() + index);
        }
        value.resize(std::max(value.size(), std::size_t{offset} + size));
        std::copy(data.begin(), data.end(), value.begin() + static_cast<std::ptrdiff_t>(offset));
        contents.names.push_back(name);
        contents.values.push_back(value);
    }
    return AfterUnsure(contents, result >= 0);
}

std::string StreamExercise::DoRemove() {
    const std::string name = SomeName();
    last_ = "remove " + Shown(name);
    StreamModel::Contents contents;
    if (!model_->exact()) contents = model_->ContentsNow();
    const int index = model_->Find(name);
    const Outcome outcome = model_->Remove(name);
    const int result = Call(0, [&] { return MAVOEASRemove(handle_, name.c_str()); });
    if (!outcome.unsure) {
        if (std::string fault = AfterChange(outcome, result); !fault.empty()) return fault;
        return outcome.result == 0 && model_->whole() ? LayoutFault(model_->file()) : "";
    }
    if (std::string fault = Check(result, errno_, outcome); !fault.empty()) return fault;
    if (contents.known && index >= 0) {
        contents.names.erase(contents.names.begin() + index);
        contents.values.erase(contents.values.begin() + index);
    }
    return AfterUnsure(contents, result == 0);
}

std::string StreamExercise::DoTruncate() {
    const std::string name = SomeName();
    const unsigned length = Below(64) == 0 ? ~Below(8) : SomeSize();
    last_ = "truncate " + Shown(name) + " to " + Number(length);
    StreamModel::Contents contents;
    if (!model_->exact()) contents = model_->ContentsNow();
    const int index = model_->Find(name);
    const Outcome outcome = model_->Truncate(name, length);
    const int result = Call(outcome.code != 0 ? 0 : length,
                            [&] { return MAVOEASTruncate(handle_, name.c_str(), length); });
    if (!outcome.unsure) return AfterChange(outcome, result);
    if (std::string fault = Check(result, errno_, outcome); !fault.empty()) return fault;
    if (contents.known && index >= 0 && result == 0) {
        Bytes value = contents.values[static_cast<std::size_t>(index)];
        value.resize(length);
        contents.names.erase(contents.names.begin() + index);
        contents.values.erase(contents.values.begin() + index);
        contents.names.push_back(name);
        contents.values.push_back(value);
    }
    return AfterUnsure(contents, result == 0);
}

std::string StreamExercise::DoAllocEntry() {
    const int count = static_cast<int>(Below(20));
    last_ = "alloc " + Number(count);
    const Outcome outcome = model_->AllocEntry(count);
    const auto room = (static_cast<std::size_t>(handle_->capacity) + 20) * sizeof(EASEntry);
    const int result = Call(room, [&] { return MAVOEASAllocEntry(handle_, count); });
    return AfterChange(outcome, result);
}

std::string StreamExercise::DoWriteHeader() {
    last_ = "write header";
    if (Below(2) == 0) {
        const auto bytes = std::span(Material()).subspan(Below(4096), 32);
        std::copy(bytes.begin(), bytes.end(), handle_->header + 50);
        model_->SetFinderInfo(bytes);
        last_ += " with Finder info";
    }
    const Outcome outcome = model_->WriteHeader();
    const int result = Call(0, [&] { return MAVOEASWriteHeader(handle_); });
    if (outcome.unsure) {
        if (std::string fault = Check(result, errno_, outcome); !fault.empty()) return fault;
        return AfterUnsure({}, result == 0);
    }
    if (std::string fault = AfterChange(outcome, result); !fault.empty()) return fault;
    if (result != 0) return {};
    if (lseek(fd_, 0, SEEK_CUR) != static_cast<off_t>(model_->data_start())) {
        return "the file position is not at the values";
    }
    return {};
}

std::string StreamExercise::DoWriteFinderInfo() {
    last_ = "write Finder info";
    const auto bytes = std::span(Material()).subspan(Below(4096), 32);
    std::copy(bytes.begin(), bytes.end(), handle_->header + 50);
    model_->SetFinderInfo(bytes);
    const bool at_home = model_->finder_offset() == 50 && model_->exact();
    const Outcome outcome = model_->WriteFinderInfo();
    const int result = Call(0, [&] { return EASWriteFinderInfo(handle_); });
    if (std::string fault = AfterChange(outcome, result); !fault.empty()) return fault;
    // Elsewhere it may have gone over whatever lies there.
    return at_home ? "" : Reopen();
}

// As callers write forks: the bytes at the end of the values, the length into the header.
std::string StreamExercise::DoPutFork() {
    if (!model_->exact() || model_->lock_type() != F_WRLCK) return {};
    const std::span<const std::uint8_t> bytes = SomeBytes();
    last_ = "put a fork of " + Number(bytes.size());
    const auto at = static_cast<off_t>(model_->total_size());
    if (at > 64 << 20) return {};
    if (ftruncate(fd_, at) != 0) abort();
    if (pwrite(fd_, bytes.data(), bytes.size(), at) != static_cast<ssize_t>(bytes.size())) abort();
    PutU32(std::span(handle_->header), kForkLengthAt, bytes.size());
    model_->PutFork(Bytes(bytes.begin(), bytes.end()));
    const Outcome outcome = model_->WriteHeader();
    return AfterChange(outcome, Call(0, [&] { return MAVOEASWriteHeader(handle_); }));
}

std::string StreamExercise::DoUpdateEntry() {
    const auto count = static_cast<unsigned>(model_->attributes().size());
    const unsigned index = Below(16) == 0 ? count + Below(3) : Below(std::max(count, 1U));
    const bool remove = Below(2) == 0;
    const bool exact = model_->exact();
    const auto needed =
        exact ? model_->data_length() -
                    (remove && index < count ? model_->attributes()[index].length : 0)
              : std::min<std::uint64_t>(U32At(std::span(handle_->header), kDataLengthAt), 1 << 16);
    Bytes buffer(static_cast<std::size_t>(needed) + Below(3), 0xA5);
    if (!buffer.empty() && Below(16) == 0)
        buffer.resize(Below(std::min<unsigned>(static_cast<unsigned>(buffer.size()), 0xFFFF)));
    const auto size = static_cast<unsigned>(buffer.size());
    last_ = (remove ? "drop entry " : "update entry ") + Number(index) + " in " + Number(size);

    Bytes gathered;
    buffer.push_back(0x5A);
    const Outcome outcome = model_->UpdateEntry(index, size, remove, &gathered);
    const int result =
        Call(0, [&] { return MAVOEASUpdateEntry(handle_, index, buffer.data(), size, remove); });
    if (std::string fault = AfterChange(outcome, result); !fault.empty()) return fault;
    if (buffer.back() != 0x5A) return "more was gathered than there was room for";
    if (!exact || outcome.result != 0) {
        // Nothing is written to the file.
        return exact ? "" : AfterUnsure({}, false);
    }
    if (!std::equal(gathered.begin(), gathered.end(), buffer.begin())) {
        return "other values were gathered";
    }
    // Memory is ahead of the file: it is either put on disk by hand, or forgotten.
    if (model_->lock_type() != F_WRLCK || Below(2) == 0) return Reopen();
    const Outcome written = model_->WriteHeader();
    const int header = Call(0, [&] { return MAVOEASWriteHeader(handle_); });
    if (std::string fault = Check(header, errno_, written); !fault.empty()) return fault;
    if (write(fd_, gathered.data(), gathered.size()) != static_cast<ssize_t>(gathered.size())) {
        abort();
    }
    model_->PutValues();
    return CheckFile();
}

std::string StreamExercise::DoLocks() {
    switch (Below(4)) {
        case 0: {
            last_ = "flush";
            return Check(Call(0, [&] { return MAVOEASFlush(handle_); }), errno_, {});
        }
        case 1: {
            last_ = "ask for the lock";
            struct flock64 lock = {};
            lock.l_type = F_WRLCK;
            lock.l_whence = SEEK_SET;
            const int result = Call(0, [&] { return MAVOEASLockGet(handle_, &lock); });
            if (result == 0 && lock.l_type != F_UNLCK) return "its own lock is in its way";
            return Check(result, errno_, {});
        }
        default: {
            static constexpr int kLocks[] = {F_WRLCK, F_WRLCK, F_WRLCK, F_WRLCK,
                                             F_RDLCK, F_UNLCK, 7,       0x10001};
            const int lock_type = kLocks[Below(std::size(kLocks))];
            last_ = "lock " + Number(lock_type);
            const Outcome outcome = model_->LockSet(lock_type);
            const int result = Call(0, [&] { return MAVOEASLockSet(handle_, lock_type); });
            if (std::string fault = Check(result, errno_, outcome); !fault.empty()) return fault;
            return CheckLock();
        }
    }
}

std::string StreamExercise::DoBadArguments() {
    last_ = "bad arguments";
    const Outcome bad{.result = -1, .code = 0xD00};
    std::uint8_t byte = 0;
    int result = 0;
    switch (Below(12)) {
        case 0:
            result = MAVOEASClose(nullptr);
            break;
        case 1:
            result = MAVOEASSearch(handle_, nullptr);
            break;
        case 2:
            result = MAVOEASEnum(handle_, nullptr);
            break;
        case 3:
            result = MAVOEASRead(handle_, "a", nullptr, 0, 0);
            break;
        case 4:
            result = MAVOEASRead(handle_, nullptr, &byte, 1, 0);
            break;
        case 5:
            result = MAVOEASWrite(handle_, "a", nullptr, 1, 0, 1);
            break;
        case 6:
            result = MAVOEASWrite(handle_, nullptr, &byte, 1, 0, 1);
            break;
        case 7:
            result = MAVOEASRemove(handle_, nullptr);
            break;
        case 8:
            result = MAVOEASTruncate(handle_, nullptr, 0);
            break;
        case 9:
            result = MAVOEASLockGet(handle_, nullptr);
            break;
        case 10:
            result = MAVOEASWriteHeader(nullptr);
            break;
        default:
            result = MAVOEASUpdateEntry(nullptr, 0, &byte, 1, 0);
            break;
    }
    return AfterChange(bad, result);
}

std::string StreamExercise::Step() {
    if (!open()) abort();
    // Out of 64.
    const unsigned kind = Below(64);
    if (kind < 22) return DoWrite();
    if (kind < 29) return DoRemove();
    if (kind < 34) return DoTruncate();
    if (kind < 42) return DoRead();
    if (kind < 44) return DoSearch();
    if (kind < 46) return DoEnum();
    if (kind < 49) return DoWriteHeader();
    if (kind < 51) return DoWriteFinderInfo();
    if (kind < 53) return DoPutFork();
    if (kind < 56) return DoUpdateEntry();
    if (kind < 57) return DoAllocEntry();
    if (kind < 58) return DoLocks();
    if (kind < 59) return DoBadArguments();
    last_ = "open again";
    return Reopen();
}

}  // namespace mavoea::test

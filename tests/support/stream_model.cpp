#include "tests/support/stream_model.h"

#include <errno.h>
#include <fcntl.h>

#include <algorithm>
#include <cstring>
#include <iterator>
#include <utility>

namespace mavoea::test {
namespace {

constexpr std::size_t kHeaderSize = 120;
constexpr std::uint64_t kValueMost = 0x7FFFFFFF;  // that a result can tell
constexpr std::uint64_t kSizeLimit = std::uint64_t{1} << 32;

// Bytes at a place, big-endian; reading and writing of this file's own, so that nothing that is
// tested has a hand in what is expected.
std::uint32_t Get(const std::uint8_t* at, int size) {
    std::uint32_t value = 0;
    for (int i = 0; i < size; ++i) value = value << 8 | at[i];
    return value;
}

void Set(std::uint8_t* at, int size, std::uint64_t value) {
    for (int i = size; i-- > 0; value >>= 8) at[i] = static_cast<std::uint8_t>(value & 0xFF);
}

// The file as reads with a position see it.
class Cursor {
 public:
    Cursor(const Bytes& file, std::uint64_t at) : file_(file), at_(at) {}

    bool Take(void* to, std::size_t size) {
        if (at_ > file_.size() || file_.size() - at_ < size) return false;
        if (size > 0) std::memcpy(to, file_.data() + at_, size);
        at_ += size;
        return true;
    }
    void Skip(std::uint64_t size) { at_ += size; }

 private:
    std::span<const std::uint8_t> file_;
    std::uint64_t at_;
};

std::uint32_t RecordBytes(std::size_t name_size) {
    return (static_cast<std::uint32_t>(name_size) + 14) / 4 * 4;
}

// A size or place in a file as one in memory, where tests have all of their files.
std::size_t InMemory(std::uint64_t size) { return static_cast<std::size_t>(size); }

// A name as C sees it.
std::string Visible(const std::string& name) { return name.c_str(); }

template <class Value>
std::string Number(Value value) {
    return std::to_string(value);
}

Outcome Failed(int code) { return {.result = -1, .code = code}; }
Outcome Unsure(int result) { return {.result = result, .unsure = true}; }

}  // namespace

// ---- Reading ------------------------------------------------------------------------------------

StreamModel::StreamModel(Bytes file, int lock_type)
    : lock_type_(lock_type), file_(std::move(file)) {
    size_least_ = size_most_ = file_.size();
    if (file_.empty()) {
        Set(&header_[0], 4, 0x00051607);
        Set(&header_[4], 4, 0x00020000);
        std::memcpy(&header_[8], "Mac OS X        ", 16);
        Set(&header_[24], 2, 2);
        Set(&header_[26], 4, 9);
        Set(&header_[30], 4, 50);
        Set(&header_[34], 4, 32);
        Set(&header_[38], 4, 2);
        Set(&header_[42], 4, 82);
        std::memcpy(&header_[84], "ATTR", 4);
        Set(&header_[96], 4, 120);
    } else {
        refused_ = Load();
    }
    if (refused_ != 0) return;
    capacity_ = attributes_.empty() ? 5 : static_cast<int>(attributes_.size());
    exact_ = FitsTogether();
}

int StreamModel::Load() {
    constexpr int kRead = 0xA00;
    Cursor in(file_, 0);
    if (!in.Take(header_.data(), 26)) return kRead;
    const unsigned count = Get(&header_[24], 2);
    if (count > 13) return 0xD00;
    for (unsigned i = 0; i < count; ++i) {
        std::uint8_t descriptor[12];
        if (!in.Take(descriptor, sizeof descriptor)) return kRead;
        const std::uint32_t id = Get(descriptor, 4);
        if (id == 9) std::memcpy(&header_[26], descriptor, sizeof descriptor);
        if (id == 2) std::memcpy(&header_[38], descriptor, sizeof descriptor);
    }
    if (!Cursor(file_, Get(&header_[30], 4)).Take(&header_[50], 32)) return kRead;
    if (Get(&header_[34], 4) == 32) {
        std::memcpy(&header_[84], "ATTR", 4);
        Set(&header_[96], 4, 120);
        return 0;
    }
    in = Cursor(file_, 82);
    if (!in.Take(&header_[82], 38)) return kRead;
    for (unsigned left = Get(&header_[118], 2); left > 0; --left) {
        std::uint8_t fixed[11];
        if (!in.Take(fixed, sizeof fixed)) return kRead;
        ModelAttribute attribute;
        attribute.offset = Get(fixed, 4);
        attribute.length = Get(fixed + 4, 4);
        attribute.flags = static_cast<std::uint16_t>(Get(fixed + 8, 2));
        attribute.name.resize(fixed[10]);
        if (!in.Take(attribute.name.data(), attribute.name.size())) return kRead;
        in.Skip(RecordBytes(attribute.name.size()) - 11 - attribute.name.size());
        attributes_.push_back(std::move(attribute));
    }
    return 0;
}

bool StreamModel::FitsTogether() {
    if (Get(&header_[26], 4) != 9) return false;
    const std::uint64_t start = Get(&header_[96], 4);
    std::uint64_t end = start;
    for (const ModelAttribute& attribute : attributes_) {
        if (attribute.offset != end) return false;
        end += attribute.length;
    }
    const std::uint64_t table_end = TableEnd();
    if (end - start != Get(&header_[100], 4) || start < table_end) return false;
    if (end > (attributes_.empty() ? 0x7FFFFFFF : file_.size())) return false;

    fork_length_ = Get(&header_[46], 4);
    fork_start_ = std::uint64_t{Get(&header_[30], 4)} + Get(&header_[34], 4);
    if (fork_start_ >= kSizeLimit) return false;
    if (fork_length_ != 0) {
        const bool plain = Get(&header_[34], 4) == 32;
        if (fork_start_ != Get(&header_[42], 4) || fork_start_ < (plain ? 82 : end)) return false;
    }
    gap_ = start - table_end;
    for (ModelAttribute& attribute : attributes_) {
        const auto at = file_.begin() + static_cast<std::ptrdiff_t>(attribute.offset);
        attribute.value.assign(at, at + static_cast<std::ptrdiff_t>(attribute.length));
    }
    FindFork();
    return true;
}

void StreamModel::FindFork() {
    const std::uint64_t from = std::min<std::uint64_t>(fork_start_, file_.size());
    const std::uint64_t to = std::min<std::uint64_t>(fork_start_ + fork_length_, file_.size());
    fork_.assign(file_.begin() + static_cast<std::ptrdiff_t>(from),
                 file_.begin() + static_cast<std::ptrdiff_t>(to));
}

std::uint64_t StreamModel::TableEnd() const {
    std::uint64_t end = kHeaderSize;
    for (const ModelAttribute& attribute : attributes_) end += RecordBytes(attribute.name.size());
    return end;
}

std::uint64_t StreamModel::data_start() const { return TableEnd() + gap_; }

std::uint64_t StreamModel::data_length() const {
    std::uint64_t length = 0;
    for (const ModelAttribute& attribute : attributes_) length += attribute.value.size();
    return length;
}

std::uint32_t StreamModel::finder_offset() const { return Get(&header_[30], 4); }
unsigned StreamModel::descriptor_count() const { return Get(&header_[24], 2); }

bool StreamModel::whole() const {
    const auto ends = [](const ModelAttribute& attribute) {
        return !attribute.name.empty() && attribute.name.back() == '\0';
    };
    return exact_ && fork_.size() == fork_length_ && Get(&header_[38], 4) == 2 &&
           std::all_of(attributes_.begin(), attributes_.end(), ends);
}

// ---- Writing ------------------------------------------------------------------------------------

void StreamModel::LayOut() {
    std::uint64_t next = data_start();
    Set(&header_[96], 4, next);
    for (ModelAttribute& attribute : attributes_) {
        attribute.offset = static_cast<std::uint32_t>(next);
        attribute.length = static_cast<std::uint32_t>(attribute.value.size());
        next += attribute.length;
    }
    Set(&header_[100], 4, data_length());
    Set(&header_[118], 2, attributes_.size());
}

void StreamModel::Put(std::uint64_t at, std::span<const std::uint8_t> bytes) {
    if (bytes.empty()) return;
    if (file_.size() < at + bytes.size()) file_.resize(InMemory(at + bytes.size()));
    std::memcpy(file_.data() + at, bytes.data(), bytes.size());
}

// Sizes, header and table. The header has its Finder info at 50, so that is where a header that is
// written says it is.
void StreamModel::PutHead() {
    LayOut();
    const std::uint64_t total = total_size();
    Set(&header_[92], 4, total);
    Set(&header_[30], 4, 50);
    Set(&header_[34], 4, total - 50);
    Set(&header_[42], 4, total);
    fork_start_ = total;

    Put(0, header_);
    Bytes table(InMemory(TableEnd() - kHeaderSize));
    std::uint8_t* at = table.data();
    for (const ModelAttribute& attribute : attributes_) {
        Set(at, 4, attribute.offset);
        Set(at + 4, 4, attribute.length);
        Set(at + 8, 2, attribute.flags);
        Set(at + 10, 1, attribute.name.size());
        std::memcpy(at + 11, attribute.name.data(), attribute.name.size());
        at += RecordBytes(attribute.name.size());
    }
    Put(kHeaderSize, table);
}

void StreamModel::PutValues() {
    Bytes values;
    values.reserve(InMemory(data_length()));
    for (const ModelAttribute& attribute : attributes_) {
        values.insert(values.end(), attribute.value.begin(), attribute.value.end());
    }
    Put(data_start(), values);
    FindFork();
    size_least_ = size_most_ = file_.size();
}

void StreamModel::Rewrite(ForkIs fork) {
    const std::uint64_t old_start = fork_start_;
    const std::uint64_t start = total_size();
    const bool moved = fork == ForkIs::kMoved && fork_length_ != 0 && start != old_start;
    const bool whole = fork_.size() == fork_length_;
    const Bytes bytes = fork_;
    if (moved) {
        // Upwards the file is given the length that it needs, which may be less than it had.
        if (start > old_start && !bytes.empty()) file_.resize(InMemory(start + bytes.size()));
        Put(start, bytes);
    }
    PutHead();
    PutValues();
    // What no value covers need not be written.
    if (file_.size() < start) file_.resize(InMemory(start));
    size_least_ = data_length() == 0 && file_.size() == start ? TableEnd() : file_.size();
    size_most_ = file_.size();
    // Of a fork that passed the end of the file, what was missing may be made up for, or not.
    if (fork == ForkIs::kMoved && !whole) {
        size_most_ = std::max<std::uint64_t>(size_most_, start + fork_length_);
    }
    if (fork == ForkIs::kMoved) fork_ = bytes;
}

Outcome StreamModel::Write(const std::string& name, std::span<const std::uint8_t> data,
                           unsigned offset, int flags) {
    if (name.size() >= 255) return Failed(0xD00);
    if (lock_type_ != F_WRLCK) return Failed(0x300);
    const int index = Find(name);
    const int size = static_cast<int>(data.size());
    if (index < 0 && (flags & 2) != 0) return {.result = -1, .error = ENOENT};
    if (index >= 0 && (flags & 1) == 0) return {.result = size > 0 ? -1 : 0, .error = EEXIST};
    if (!exact_) return Unsure(size);

    const std::uint64_t needed = std::uint64_t{offset} + data.size();
    const std::uint64_t old_length =
        index < 0 ? 0 : attributes_[static_cast<std::size_t>(index)].value.size();
    const std::uint64_t added = needed > old_length ? needed - old_length : 0;
    const std::uint64_t record = index < 0 ? RecordBytes(name.size() + 1) : 0;
    const std::uint64_t total = total_size() + added + record;
    if (total >= kSizeLimit || total + fork_.size() > kSizeLimit) return Failed(0xD00);
    if (index < 0 && attributes_.size() == 0xFFFF) return Failed(0xD00);
    if (old_length + added > kValueMost) return Failed(0xD00);

    ModelAttribute written;
    if (index < 0) {
        if (attributes_.empty()) gap_ = 0;
        if (attributes_.size() == static_cast<std::size_t>(capacity_)) capacity_ += 5;
        written.name.assign(name.c_str(), name.size() + 1);
    } else {
        written = std::move(attributes_[static_cast<std::size_t>(index)]);
        attributes_.erase(attributes_.begin() + index);
    }
    written.value.resize(static_cast<std::size_t>(old_length + added));
    if (size > 0) std::memcpy(written.value.data() + offset, data.data(), data.size());
    attributes_.push_back(std::move(written));
    Rewrite(ForkIs::kMoved);
    return {.result = size};
}

Outcome StreamModel::Remove(const std::string& name) {
    if (lock_type_ != F_WRLCK) return Failed(0x300);
    const int index = Find(name);
    if (index < 0) return Failed(0x2000);
    if (!exact_) return Unsure(0);

    const std::size_t name_size = attributes_[static_cast<std::size_t>(index)].name.size();
    attributes_.erase(attributes_.begin() + index);
    // Its record's size is counted in eight bits.
    gap_ += RecordBytes(name_size) / 256 * 256;
    Rewrite(ForkIs::kMoved);

    const std::uint64_t start = total_size();
    const std::uint64_t declared = 26 + 12 * std::uint64_t{descriptor_count()};
    file_.resize(InMemory(std::max(start + fork_.size(), declared)));
    size_least_ = start + fork_.size();
    size_most_ = std::max(start + fork_length_, declared);
    return {};
}

Outcome StreamModel::Truncate(const std::string& name, unsigned length) {
    if (lock_type_ != F_WRLCK) return Failed(0x300);
    const int index = Find(name);
    if (index < 0) return Failed(0x2000);
    if (!exact_) return Unsure(0);

    if (length > kValueMost) return Failed(0xD00);
    const std::size_t at = static_cast<std::size_t>(index);
    const std::uint64_t total = total_size() - attributes_[at].value.size() + length;
    if (total >= kSizeLimit ||
        total + std::min<std::uint64_t>(fork_length_, file_.size()) > kSizeLimit) {
        return Failed(0xD00);
    }
    ModelAttribute cut = std::move(attributes_[at]);
    attributes_.erase(attributes_.begin() + index);
    cut.value.resize(length);
    attributes_.push_back(std::move(cut));
    Rewrite(ForkIs::kLeft);
    return {};
}

Outcome StreamModel::UpdateEntry(unsigned index, unsigned size, bool remove, Bytes* gathered) {
    if (index >= attributes_.size()) return Failed(0xD00);
    const std::uint64_t length = exact_ ? data_length() : Get(&header_[100], 4);
    const std::uint64_t dropped = remove ? attributes_[index].length : 0;
    if (size + dropped < length) return Failed(0x100);
    if (!exact_) return Unsure(0);

    ModelAttribute moved = std::move(attributes_[index]);
    attributes_.erase(attributes_.begin() + static_cast<std::ptrdiff_t>(index));
    if (remove) {
        gap_ += RecordBytes(moved.name.size()) / 256 * 256;
    } else {
        attributes_.push_back(std::move(moved));
    }
    gathered->clear();
    for (const ModelAttribute& attribute : attributes_) {
        gathered->insert(gathered->end(), attribute.value.begin(), attribute.value.end());
    }
    LayOut();
    return {};
}

Outcome StreamModel::WriteHeader() {
    if (lock_type_ != F_WRLCK) return Failed(0x300);
    if (!exact_) return Unsure(0);
    if (total_size() >= kSizeLimit) return Failed(0xA00);
    PutHead();
    FindFork();
    size_least_ = size_most_ = file_.size();
    return {};
}

Outcome StreamModel::WriteFinderInfo() {
    if (lock_type_ != F_WRLCK) return Failed(0x300);
    const std::uint32_t at = finder_offset();
    // Where a file has its header it has no Finder info.
    if (at < std::min(26 + 12 * descriptor_count(), 50U)) return Failed(0xD00);
    Put(at, std::span(header_).subspan(50, 32));
    size_least_ = size_most_ = file_.size();
    return {};
}

void StreamModel::SetFinderInfo(std::span<const std::uint8_t> bytes) {
    std::memcpy(&header_[50], bytes.data(), 32);
}

void StreamModel::PutFork(Bytes fork) {
    fork_length_ = static_cast<std::uint32_t>(fork.size());
    Set(&header_[46], 4, fork_length_);
    file_.resize(InMemory(total_size()));
    Put(total_size(), fork);
    size_least_ = size_most_ = file_.size();
}

// ---- Looking and the rest -----------------------------------------------------------------------

int StreamModel::Find(const std::string& name) const {
    for (std::size_t i = attributes_.size(); i-- > 0;) {
        if (std::strcmp(attributes_[i].name.c_str(), name.c_str()) == 0) {
            return static_cast<int>(i);
        }
    }
    return -1;
}

Outcome StreamModel::Search(const std::string& name) const {
    const int index = Find(name);
    return index < 0 ? Failed(0x2000) : Outcome{.result = index};
}

Outcome StreamModel::Enum(std::vector<std::string>* names) const {
    names->clear();
    for (const ModelAttribute& attribute : attributes_) names->push_back(Visible(attribute.name));
    return {.result = static_cast<int>(attributes_.size())};
}

Outcome StreamModel::Read(const std::string& name, unsigned size, unsigned offset,
                          Bytes* found) const {
    found->clear();
    if (lock_type_ == F_UNLCK) return Failed(0x300);
    const int index = Find(name);
    if (index < 0) return Failed(0x2000);
    const ModelAttribute& attribute = attributes_[static_cast<std::size_t>(index)];
    if (attribute.length < offset) return {};
    const std::uint32_t left = attribute.length - offset;
    if ((size == 0 ? attribute.length : std::min(size, left)) > kValueMost) return Failed(0xA00);
    if (size == 0) return {.result = static_cast<int>(attribute.length)};
    const std::uint32_t count = std::min(size, left);
    const std::uint64_t from = std::uint64_t{attribute.offset} + offset;
    if (count > 0 && (from > file_.size() || file_.size() - from < count)) return Failed(0xA00);
    if (count > 0) {
        const auto at = file_.begin() + static_cast<std::ptrdiff_t>(from);
        found->assign(at, at + static_cast<std::ptrdiff_t>(count));
    }
    return {.result = static_cast<int>(count)};
}

Outcome StreamModel::AllocEntry(int count) {
    capacity_ += count == 0 ? 5 : count;
    return {};
}

Outcome StreamModel::LockSet(int lock_type) {
    if (lock_type != F_RDLCK && lock_type != F_WRLCK && lock_type != F_UNLCK) return Failed(0x400);
    lock_type_ = lock_type;
    return {};
}

StreamModel::Contents StreamModel::ContentsNow() const {
    Contents contents;
    Enum(&contents.names);
    std::uint64_t size = 0;
    for (const ModelAttribute& attribute : attributes_) {
        size += attribute.length;
        if (std::uint64_t{attribute.offset} + attribute.length > file_.size()) {
            // An empty value lies nowhere.
            if (attribute.length != 0) return contents;
        }
    }
    if (size > file_.size()) return contents;
    for (const ModelAttribute& attribute : attributes_) {
        Bytes value(attribute.length);
        if (!value.empty()) {
            std::memcpy(value.data(), file_.data() + attribute.offset, value.size());
        }
        contents.values.push_back(std::move(value));
    }
    contents.known = true;
    return contents;
}

// ---- Comparing ----------------------------------------------------------------------------------

std::string StreamModel::CompareFile(const Bytes& found) {
    const std::uint64_t size = found.size();
    if (size != file_.size() && (size < size_least_ || size > size_most_)) {
        return "the file has " + Number(size) + " bytes and not " + Number(file_.size()) +
               (size_least_ == size_most_
                    ? ""
                    : " (" + Number(size_least_) + " to " + Number(size_most_) + ")");
    }
    const std::uint64_t common = std::min<std::uint64_t>(size, file_.size());
    // What lies in a gap is anybody's.
    const std::uint64_t gap_from = exact_ ? std::min(TableEnd(), common) : common;
    const std::uint64_t gap_to = exact_ ? std::min(data_start(), common) : common;
    const std::pair<std::size_t, std::size_t> parts[] = {{0, InMemory(gap_from)},
                                                         {InMemory(gap_to), InMemory(common)}};
    for (const auto& [from, to] : parts) {
        if (from == to || std::memcmp(&found[from], &file_[from], to - from) == 0) continue;
        std::size_t at = from;
        while (found[at] == file_[at]) ++at;
        return "the file has " + Number(found[at]) + " at " + Number(at) + " and not " +
               Number(file_[at]);
    }
    if (size != file_.size() || gap_from != gap_to) file_ = found;
    size_least_ = size_most_ = file_.size();
    if (exact_ && fork_.size() != fork_length_) FindFork();
    return {};
}

std::string StreamModel::CompareHandle(const EASHandle& handle) const {
    if (handle.lockType != lock_type_) return "the handle has lock " + Number(handle.lockType);
    if (handle.capacity != capacity_) {
        return "the table has room for " + Number(handle.capacity) + " and not " +
               Number(capacity_);
    }
    for (std::size_t i = 0; i < kHeaderSize; ++i) {
        if (handle.header[i] != header_[i]) {
            return "the header has " + Number(handle.header[i]) + " at " + Number(i) + " and not " +
                   Number(header_[i]);
        }
    }
    for (std::size_t i = 0; i < attributes_.size(); ++i) {
        const EASEntry& entry = handle.entries[i];
        const ModelAttribute& attribute = attributes_[i];
        if (entry.offset != attribute.offset || entry.length != attribute.length ||
            entry.flags != attribute.flags || entry.nameLength != attribute.name.size()) {
            return "record " + Number(i) + " differs: " + Number(entry.length) + " bytes at " +
                   Number(entry.offset) + " and not " + Number(attribute.length) + " at " +
                   Number(attribute.offset);
        }
        if (entry.name == nullptr ||
            std::memcmp(entry.name, attribute.name.data(), attribute.name.size()) != 0 ||
            std::strcmp(entry.name, attribute.name.c_str()) != 0) {
            return "record " + Number(i) + " has another name than " + Visible(attribute.name);
        }
    }
    for (auto i = static_cast<std::ptrdiff_t>(attributes_.size()); i < handle.capacity; ++i) {
        const EASEntry& entry = handle.entries[i];
        if (entry.offset != 0 || entry.length != 0 || entry.flags != 0 || entry.nameLength != 0 ||
            entry.name != nullptr) {
            return "record " + Number(i) + " is not empty";
        }
    }
    return {};
}

std::string LayoutFault(const Bytes& file) {
    const std::uint64_t size = file.size();
    if (size < kHeaderSize) return "there is no header";
    const auto at = [&](std::size_t place, int width) { return Get(&file[place], width); };
    if (at(26, 4) != 9 || at(38, 4) != 2) return "the descriptors are not in their places";
    const std::uint64_t total = at(92, 4);
    const std::uint64_t start = at(96, 4);
    const std::uint64_t length = at(100, 4);
    if (total != start + length) return "the total size is not where the values end";
    if (at(42, 4) != total) return "the fork is not at the total size";
    if (std::uint64_t{at(30, 4)} + at(34, 4) != total) return "the Finder info does not end there";
    if (total > size && length != 0) return "the values pass the end of the file";
    if (total + at(46, 4) > size && at(46, 4) != 0) return "the fork passes the end of the file";

    std::size_t record = kHeaderSize;
    std::uint64_t next = start;
    for (unsigned left = at(118, 2); left > 0; --left) {
        if (record + 11 > size) return "the table passes the end of the file";
        if (at(record, 4) != next) return "a value does not begin where the one before it ends";
        next += at(record + 4, 4);
        const std::size_t name_size = at(record + 10, 1);
        const std::size_t end = record + RecordBytes(name_size);
        if (end > size || end > start) return "the table passes its end";
        if (name_size == 0 || file[record + 10 + name_size] != 0) return "a name has no end";
        for (std::size_t i = record + 11 + name_size; i < end; ++i) {
            if (file[i] != 0) return "the padding of a record is not zero";
        }
        record = end;
    }
    if (next != start + length) return "the values do not end where the data area does";
    return {};
}

}  // namespace mavoea::test

// The changes of a stream that crashes and power losses are tried on.
#ifndef MAVOEA_TESTS_CRASH_STREAM_OPERATIONS_H_
#define MAVOEA_TESTS_CRASH_STREAM_OPERATIONS_H_

#include <fcntl.h>
#include <sys/types.h>

#include <functional>
#include <optional>
#include <set>
#include <string>

#include "include/mavoea.h"
#include "platform/kernel.h"
#include "stream/internal.h"
#include "tests/crash/metadata.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

// The attribute that is written.
inline constexpr char kItem[] = "x";

struct StreamOperation {
    std::string name;
    Bytes before;                    // of the file
    Items wanted;                    // of others than the item that is written
    std::optional<Bytes> old_value;  // of that; none where it is not there
    std::optional<Bytes> new_value;
    std::function<int(int fd)> run;
    std::string item = kItem;  // what is written
};

// A stream open for writing.
class Stream {
 public:
    explicit Stream(int fd) : handle_(MAVOEASOpen(fd, F_WRLCK)) {}
    ~Stream() {
        if (handle_ != nullptr) (void)MAVOEASClose(handle_);
    }
    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;

    EASHandle* get() const { return handle_; }

    int Write(const std::string& name, const Bytes& value) const {
        return MAVOEASWrite(handle_, name.c_str(), value.data(),
                            static_cast<unsigned>(value.size()), 0, EAS_WRITE_OVERWRITE) < 0
                   ? -1
                   : 0;
    }
    int Replace(const std::string& name, const Bytes& value) const {
        return EASReplace(handle_, name.c_str(), value);
    }
    int Remove(const std::string& name) const { return MAVOEASRemove(handle_, name.c_str()); }
    int Truncate(const std::string& name, unsigned length) const {
        return MAVOEASTruncate(handle_, name.c_str(), length);
    }

 private:
    EASHandle* handle_;
};

inline Bytes OfItem(const std::string& name, std::size_t size) {
    return Pattern(size, static_cast<std::uint8_t>(name[0]));
}

inline StreamImage ThreeAttributes(std::size_t size, std::size_t fork) {
    StreamImage image;
    for (const char* const name : {"a", kItem, "c"}) {
        image.attributes.push_back({name, OfItem(name, size)});
    }
    image.finder_info = Pattern(32, 0x40);
    image.fork = Pattern(fork, 4);
    return image;
}

// What the others are: all but the one item that an operation is about.
inline Items OthersOf(const StreamImage& image, const std::string& item) {
    Items items = {{kFinderItem, image.finder_info}, {kForkItem, image.fork}};
    for (const Attribute& attribute : image.attributes) items[attribute.name] = attribute.value;
    items.erase(item);
    return items;
}

// What is left of the item that an operation is about, and which others are lost.
struct Cost {
    std::string outcome;
    std::set<std::string> lost = {};

    std::string Text() const { return outcome + (lost.empty() ? "" : "; LOST " + Listed(lost)); }
};

inline Cost CostOfStream(const StreamOperation& operation, int fd) {
    const Look look = LookAtStream(fd);
    if (look.refusal != 0) return {"REFUSED"};
    std::optional<Bytes> value;
    if (const auto at = look.items.find(operation.item); at != look.items.end()) value = at->second;
    Cost cost = {value == operation.old_value   ? "old"
                 : value == operation.new_value ? "new"
                                                : "LOST the value"};
    const auto whole = WholeIn(look.items, operation.wanted);
    for (const auto& [name, bytes] : operation.wanted) {
        if (!whole.contains(name)) cost.lost.insert(name);
    }
    return cost;
}

// What a caller does who shortens a value before a fork: the fork's bytes, which stay where they
// were, are written behind the values again.
inline int TruncateBeforeFork(int fd, unsigned length) {
    const Stream stream(fd);
    const std::uint32_t size = U32At({stream.get()->header, 120}, kForkLengthAt);
    Bytes fork(size);
    const auto from = static_cast<off_t>(U32At({stream.get()->header, 120}, kForkOffsetAt));
    if (kernel::Pread(fd, fork.data(), size, from) != static_cast<ssize_t>(size)) return -1;
    if (stream.Truncate(kItem, length) != 0) return -1;
    const auto to = static_cast<off_t>(U32At({stream.get()->header, 120}, kForkOffsetAt));
    if (kernel::Pwrite(fd, fork.data(), size, to) != static_cast<ssize_t>(size)) return -1;
    return MAVOEASFlush(stream.get());
}

inline StreamOperation WriteOf(const std::string& name, std::size_t size, std::size_t fork,
                               std::optional<std::size_t> old_size, std::size_t new_size) {
    StreamImage image = ThreeAttributes(size, fork);
    StreamOperation operation;
    operation.name = name;
    if (old_size) {
        operation.old_value = OfItem(kItem, *old_size);
        image.attributes[1].value = *operation.old_value;
    } else {
        image.attributes.erase(image.attributes.begin() + 1);
    }
    const Bytes value = Pattern(new_size, 0x77);
    operation.before = image.Build();
    operation.wanted = OthersOf(image, kItem);
    operation.new_value = value;
    operation.run = [value](int fd) { return Stream(fd).Write(kItem, value); };
    return operation;
}

// The same of the one that is the last already: "c".
inline StreamOperation WriteOfLast(const std::string& name, std::size_t size, std::size_t fork,
                                   std::size_t new_size) {
    const StreamImage image = ThreeAttributes(size, fork);
    const Bytes value = Pattern(new_size, 0x77);
    return {
        .name = name,
        .before = image.Build(),
        .wanted = OthersOf(image, "c"),
        .old_value = OfItem("c", size),
        .new_value = value,
        .run = [value](int fd) { return Stream(fd).Write("c", value); },
        .item = "c",
    };
}

inline StreamOperation ReplacementOf(const std::string& name, std::size_t size, std::size_t fork,
                                     std::size_t new_size) {
    StreamOperation operation = WriteOf(name, size, fork, size, new_size);
    operation.run = [value = *operation.new_value](int fd) {
        return Stream(fd).Replace(kItem, value);
    };
    return operation;
}

inline StreamOperation RemovalOf(const std::string& name, std::size_t size, std::size_t fork) {
    const StreamImage image = ThreeAttributes(size, fork);
    return {
        .name = name,
        .before = image.Build(),
        .wanted = OthersOf(image, kItem),
        .old_value = OfItem(kItem, size),
        .new_value = std::nullopt,
        .run =
            [](int fd) {
                const Stream stream(fd);
                if (stream.Remove(kItem) == 0) return 0;
                return MLIBCErrGet() == 0x2000 ? 0 : -1;  // It has gone already.
            },
    };
}

inline StreamOperation TruncationOf(const std::string& name, std::size_t size, std::size_t fork,
                                    unsigned length) {
    const StreamImage image = ThreeAttributes(size, fork);
    Bytes shorter = OfItem(kItem, size);
    shorter.resize(length);
    return {
        .name = name,
        .before = image.Build(),
        .wanted = OthersOf(image, kItem),
        .old_value = OfItem(kItem, size),
        .new_value = shorter,
        .run =
            [=](int fd) {
                return fork == 0 ? Stream(fd).Truncate(kItem, length)
                                 : TruncateBeforeFork(fd, length);
            },
    };
}

inline StreamOperation WriteToAnEmptyFile() {
    StreamOperation operation = WriteOf("write to an empty stream", 0, 0, std::nullopt, 300);
    operation.before = {};
    operation.wanted = {{kFinderItem, Repeat(0, 32)}, {kForkItem, {}}};
    return operation;
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_CRASH_STREAM_OPERATIONS_H_

// Attributes before a large resource fork, which has to make way for new ones.

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <string>

#include "bench/floor.h"
#include "bench/rows.h"
#include "include/mavoea.h"
#include "tests/support/stream_builder.h"

namespace mavoea::bench {
namespace {

using test::Bytes;
using test::StreamImage;

constexpr std::int64_t kForkSize = std::int64_t{100} << 20;
constexpr std::size_t kValueSize = 32;

// The fork's bytes, chunk by chunk: each chunk begins with its number.
constexpr std::int64_t kChunkSize = 1 << 20;
constexpr std::int64_t kChunks = kForkSize / kChunkSize;

Bytes Chunk(std::int64_t index) {
    static const Bytes pattern = test::Pattern(kChunkSize);
    Bytes chunk = pattern;
    test::PutU32(chunk, 0, static_cast<std::uint64_t>(index));
    return chunk;
}

std::string NameOf(std::size_t index) { return "user.attribute." + std::to_string(1000 + index); }

// Header, table and values of a stream whose fork follows.
class Head {
 public:
    explicit Head(std::size_t count) {
        for (std::size_t i = 0; i < count; ++i) Add();
    }

    void Add() {
        image_.attributes.push_back(
            {.name = NameOf(image_.attributes.size()), .value = test::Pattern(kValueSize)});
    }
    void SetLastValue(const Bytes& value) { image_.attributes.back().value = value; }
    const test::Attribute& last() const { return image_.attributes.back(); }

    Bytes Build() const {
        Bytes bytes = image_.Build();
        test::PutU32(bytes, test::kForkLengthAt, kForkSize);
        return bytes;
    }

 private:
    StreamImage image_;
};

// A stream's file with its fork, clean on disk.
class ForkFile {
 public:
    ForkFile(const Place& place, const Head& head)
        : path_(place.NewPath()), file_(path_, O_RDWR | O_CREAT) {
        const Bytes bytes = head.Build();
        Require(floor::WriteDurably(fd(), bytes), "cannot write a file");
        auto at = static_cast<off_t>(bytes.size());
        for (std::int64_t i = 0; i < kChunks; ++i, at += kChunkSize) {
            Require(pwrite(fd(), Chunk(i).data(), kChunkSize, at) == kChunkSize,
                    "cannot write a file");
        }
        Require(fsync(fd()) == 0, "cannot write a file");
    }
    ~ForkFile() { unlink(path_.c_str()); }

    int fd() const { return file_.fd(); }

    // The file is that head and the whole fork behind it, and nothing else.
    bool Holds(const Head& head) const {
        const Bytes bytes = head.Build();
        auto at = static_cast<std::int64_t>(bytes.size());
        if (file_.Read(0, bytes.size()) != bytes || file_.Size() != at + kForkSize) return false;
        for (std::int64_t i = 0; i < kChunks; ++i, at += kChunkSize) {
            if (file_.Read(at, kChunkSize) != Chunk(i)) return false;
        }
        return true;
    }

 private:
    std::string path_;
    File file_;
};

class ByLibrary {
 public:
    explicit ByLibrary(const Place& place)
        : head_(1), file_(place, head_), handle_(MAVOEASOpen(file_.fd(), F_WRLCK)) {
        Require(handle_ != nullptr, "cannot open a stream");
    }
    ~ByLibrary() { MAVOEASClose(handle_); }
    ByLibrary(const ByLibrary&) = delete;
    ByLibrary& operator=(const ByLibrary&) = delete;

    void Add() {
        head_.Add();
        Write(0);
    }
    void Overwrite() { Write(EAS_WRITE_OVERWRITE); }
    bool Done() const { return file_.Holds(head_); }

 private:
    void Write(int flags) {
        const test::Attribute& attribute = head_.last();
        Require(MAVOEASWrite(handle_, attribute.name.c_str(), attribute.value.data(), kValueSize, 0,
                             flags) == kValueSize,
                "cannot write an attribute");
    }

    Head head_;
    ForkFile file_;
    EASHandle* handle_;
};

class ByHand {
 public:
    explicit ByHand(const Place& place) : head_(1), bytes_(head_.Build()), file_(place, head_) {}

    void Add() {
        const auto from = static_cast<std::int64_t>(bytes_.size());
        head_.Add();
        bytes_ = head_.Build();
        const auto by = static_cast<std::int64_t>(bytes_.size()) - from;
        Require(floor::MoveUpAndWriteDurably(file_.fd(), from, kForkSize, by, bytes_),
                "cannot move a fork");
    }
    void Overwrite() { Require(floor::WriteDurably(file_.fd(), bytes_), "cannot write a file"); }
    bool Done() const { return file_.Holds(head_); }

 private:
    Head head_;
    Bytes bytes_;
    ForkFile file_;
};

template <class By>
Prepare Adding(const Place& place) {
    return [place] {
        const auto by = std::make_shared<By>(place);
        by->Add();
        Require(by->Done(), "not the stream that is due behind a new attribute");
        return Repeat([by] { by->Add(); });
    };
}

template <class By>
Prepare Overwriting(const Place& place) {
    return [place] {
        const auto by = std::make_shared<By>(place);
        by->Overwrite();
        Require(by->Done(), "not the stream that is due after an overwrite");
        return Repeat([by] { by->Overwrite(); });
    };
}

}  // namespace

void AddForkRows(const Place& place, std::vector<Row>* rows) {
    rows->push_back({.work = "1 attribute before a fork of 100 MiB",
                     .where = place.name,
                     .aim = 1.15,
                     .library = Adding<ByLibrary>(place),
                     .floor = Adding<ByHand>(place),
                     .waits = place.durable,
                     .batch = 1});
    rows->push_back({.work = "overwrite before a fork of 100 MiB",
                     .where = place.name,
                     .aim = place.durable ? 1.15 : 3,
                     .library = Overwriting<ByLibrary>(place),
                     .floor = Overwriting<ByHand>(place),
                     .waits = place.durable});
}

}  // namespace mavoea::bench

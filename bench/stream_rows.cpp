// EA streams: reading a value, overwriting one, listing, filling a stream attribute by attribute.

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <string>

#include "bench/floor.h"
#include "bench/rows.h"
#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tests/support/stream_builder.h"

namespace mavoea::bench {
namespace {

using test::Attribute;
using test::Bytes;
using test::StreamImage;

constexpr std::size_t kValueSize = 32;
constexpr int kMany = 1000;

std::string NameOf(int index) {
    const std::string digits = std::to_string(index);
    return "user.attribute." + std::string(4 - digits.size(), '0') + digits;
}

StreamImage ImageOf(int count) {
    StreamImage image;
    for (int i = 0; i < count; ++i) {
        image.attributes.push_back(
            {.name = NameOf(i), .value = test::Pattern(kValueSize, static_cast<std::uint8_t>(i))});
    }
    return image;
}

// A stream of `count` attributes; the file is removed with its directory.
std::string NewStream(const Place& place, int count) {
    std::string path = place.NewPath();
    test::WriteFile(path, ImageOf(count).Build());
    return path;
}

// An open stream; its descriptor and its lock go with it.
class Stream {
 public:
    Stream(const std::string& path, int flags, int lock_type)
        : file_(path, flags), handle_(MAVOEASOpen(file_.fd(), lock_type)) {
        Require(handle_ != nullptr, "cannot open the stream " + path);
    }
    ~Stream() { MAVOEASClose(handle_); }
    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;

    EASHandle* handle() const { return handle_; }
    // Through the stream's own descriptor: closing another one would drop its lock.
    Bytes Content() const { return file_.Read(0, static_cast<std::size_t>(file_.Size())); }

 private:
    File file_;
    EASHandle* handle_;
};

class List {
 public:
    List() : list_(MLIBCSzListAlloc(0)) { Require(list_ != nullptr, "no string list"); }
    ~List() { MLIBCSzListFree(list_); }
    List(const List&) = delete;
    List& operator=(const List&) = delete;

    MLIBCSzList** get() { return &list_; }
    void Clear() { MLIBCSzListRemoveAll(list_); }

    bool Holds(int count) const {
        for (int i = 0; i < count; ++i) {
            const char* const name = MLIBCSzListGet(list_, i);
            if (name == nullptr || NameOf(i) != name) return false;
        }
        return MLIBCSzListGet(list_, count) == nullptr;
    }

 private:
    MLIBCSzList* list_;
};

// ---- Reading one value
// ----------------------------------------------------------------------------

int ReadThroughLibrary(const char* path, const std::string& name, std::uint8_t* to,
                       std::size_t size) {
    const int fd = open(path, O_RDONLY);
    EASHandle* const h = MAVOEASOpen(fd, F_RDLCK);
    const int got = MAVOEASRead(h, name.c_str(), to, static_cast<unsigned>(size), 0);
    MAVOEASClose(h);
    close(fd);
    return got;
}

template <class Read>
Prepare Reading(const Place& place, int count, Read read) {
    return [place, count, read] {
        const std::string path = NewStream(place, count);
        const Attribute wanted = ImageOf(count).attributes[static_cast<std::size_t>(count) / 2];
        const auto value = std::make_shared<Bytes>(kValueSize);
        Require(read(path.c_str(), wanted.name, value->data(), value->size()) == kValueSize &&
                    *value == wanted.value,
                "not the value that is due");
        return Repeat([path, name = wanted.name, value, read] {
            benchmark::DoNotOptimize(read(path.c_str(), name, value->data(), value->size()));
        });
    };
}

// ---- Overwriting one value
// ------------------------------------------------------------------------

constexpr int kFew = 10;

// The attributes in turn, so that each is the first one when it is overwritten.
class Overwriter {
 public:
    explicit Overwriter(const std::string& path) : stream_(path, O_RDWR, F_WRLCK) {
        for (int i = 0; i < kFew; ++i) names_[static_cast<std::size_t>(i)] = NameOf(i);
    }

    int Overwrite(const Bytes& value) {
        const std::string& name = names_[next_];
        next_ = (next_ + 1) % names_.size();
        return MAVOEASWrite(stream_.handle(), name.c_str(), value.data(),
                            static_cast<unsigned>(value.size()), 0, EAS_WRITE_OVERWRITE);
    }

    Bytes Content() const { return stream_.Content(); }

 private:
    Stream stream_;
    std::array<std::string, kFew> names_;
    std::size_t next_ = 0;
};

StreamImage ImageAfterOverwrite(const Bytes& value) {
    StreamImage image = ImageOf(kFew);
    image.attributes.front().value = value;
    std::rotate(image.attributes.begin(), image.attributes.begin() + 1, image.attributes.end());
    return image;
}

Prepare OverwritingThroughLibrary(const Place& place) {
    return [place] {
        const auto stream = std::make_shared<Overwriter>(NewStream(place, kFew));
        const Bytes value = test::Pattern(kValueSize, 99);
        Require(stream->Overwrite(value) == kValueSize &&
                    stream->Content() == ImageAfterOverwrite(value).Build(),
                "not the stream that is due after an overwrite");
        return Repeat([stream, value] {
            Require(stream->Overwrite(value) == kValueSize, "cannot overwrite an attribute");
        });
    };
}

Prepare OverwritingByHand(const Place& place) {
    return [place] {
        const auto file = std::make_shared<File>(NewStream(place, kFew), O_RDWR);
        const Bytes image = ImageAfterOverwrite(test::Pattern(kValueSize, 99)).Build();
        Require(floor::WriteDurably(file->fd(), image) && file->Read(0, image.size() + 1) == image,
                "not the stream that is due after an overwrite");
        return Repeat([file, image] {
            Require(floor::WriteDurably(file->fd(), image), "cannot write a file");
        });
    };
}

// ---- Setting one value of an object
// ---------------------------------------------------------------

// As a service does that is asked to set an attribute.
int SetThroughLibrary(const std::string& object, const std::string& name, const Bytes& value) {
    const int fd = MAVOEAOpen(EA_FORM_FILE, object.c_str(), MAVOEA_KIND_STREAM, O_RDWR | O_CREAT,
                              EA_PLACE_EADIR);
    EASHandle* const h = MAVOEASOpen(fd, F_WRLCK);
    const int put = MAVOEASWrite(h, name.c_str(), value.data(), static_cast<unsigned>(value.size()),
                                 0, EAS_WRITE_OVERWRITE);
    MAVOEASClose(h);
    close(fd);
    return put;
}

// The object whose stream has a few attributes.
std::string NewObject(const Place& place) {
    std::string object = place.NewPath();
    const std::size_t name = object.rfind('/') + 1;
    const std::string dir = object.substr(0, name) + "@eaDir";
    (void)mkdir(dir.c_str(), 0777);
    test::WriteFile(dir + "/" + object.substr(name) + "@" MAVOEA_KIND_STREAM,
                    ImageOf(kFew).Build());
    return object;
}

Prepare SettingThroughLibrary(const Place& place) {
    return [place] {
        const std::string object = NewObject(place);
        const Bytes value = test::Pattern(kValueSize, 99);
        std::array<std::string, kFew> names;
        for (int i = 0; i < kFew; ++i) names[static_cast<std::size_t>(i)] = NameOf(i);
        Require(SetThroughLibrary(object, names[0], value) == kValueSize,
                "cannot set an attribute");
        return Repeat([object, value, names, next = std::size_t{1}]() mutable {
            Require(SetThroughLibrary(object, names[next], value) == kValueSize,
                    "cannot set an attribute");
            next = (next + 1) % names.size();
        });
    };
}

Prepare SettingByHand(const Place& place) {
    return [place] {
        const std::string path = NewStream(place, kFew);
        const Bytes image = ImageAfterOverwrite(test::Pattern(kValueSize, 99)).Build();
        return Repeat([path, image] {
            Require(floor::LockAndReplace(path.c_str(), image), "cannot replace a stream");
        });
    };
}

// ---- Overwriting a value of a large stream ------------------------------------------------------

// So many values of one size.
struct Large {
    int count;
    std::size_t size;
    const char* last;  // the title where the same value is overwritten again, the last one then
    const char* first;
};

constexpr Large kLarge[] = {{10, 1'000'000, "durable overwrite of the last of 10 x 1 MB",
                             "durable overwrite of the first of 10 x 1 MB"},
                            {kMany, 1024, "durable overwrite of the last of 1,000 x 1 KiB",
                             "durable overwrite of the first of 1,000 x 1 KiB"}};

StreamImage ImageOf(const Large& large, const Bytes& last) {
    StreamImage image = ImageOf(large.count);
    for (Attribute& attribute : image.attributes) attribute.value = test::Pattern(large.size);
    image.attributes.back().value = last;
    return image;
}

Prepare OverwritingTheLastThroughLibrary(const Place& place, const Large& large) {
    return [place, large] {
        const std::string path = place.NewPath();
        test::WriteFile(path, ImageOf(large, test::Pattern(large.size, 1)).Build());
        const auto stream = std::make_shared<Stream>(path, O_RDWR, F_WRLCK);
        const Bytes value = test::Pattern(large.size, 99);
        const auto overwrite = [stream, value, name = NameOf(large.count - 1)] {
            Require(MAVOEASWrite(stream->handle(), name.c_str(), value.data(),
                                 static_cast<unsigned>(value.size()), 0,
                                 EAS_WRITE_OVERWRITE) == static_cast<int>(value.size()),
                    "cannot overwrite an attribute");
        };
        overwrite();
        Require(stream->Content() == ImageOf(large, value).Build(),
                "not the stream that is due after an overwrite");
        return Repeat(overwrite);
    };
}

Prepare OverwritingTheLastByHand(const Place& place, const Large& large) {
    return [place, large] {
        const std::string path = place.NewPath();
        test::WriteFile(path, ImageOf(large, test::Pattern(large.size, 1)).Build());
        const auto file = std::make_shared<File>(path, O_RDWR);
        const Bytes value = test::Pattern(large.size, 99);
        const auto overwrite = [file, value,
                                at = file->Size() - static_cast<std::int64_t>(large.size)] {
            Require(floor::WriteDurably(file->fd(), value, at), "cannot write a file");
        };
        overwrite();
        Require(
            file->Read(0, static_cast<std::size_t>(file->Size())) == ImageOf(large, value).Build(),
            "not the stream that is due after an overwrite");
        return Repeat(overwrite);
    };
}

// The stream behind an overwrite of the first of them.
StreamImage ImageAfterFirst(const Large& large, const Bytes& value) {
    StreamImage image = ImageOf(large, value);
    for (int i = 0; i < large.count; ++i) {
        image.attributes[static_cast<std::size_t>(i)].name = NameOf((i + 1) % large.count);
    }
    return image;
}

// The attributes in turn, so that each is the first one.
Prepare OverwritingTheFirstThroughLibrary(const Place& place, const Large& large) {
    return [place, large] {
        const std::string path = place.NewPath();
        test::WriteFile(path, ImageOf(large, test::Pattern(large.size)).Build());
        const auto stream = std::make_shared<Stream>(path, O_RDWR, F_WRLCK);
        const Bytes value = test::Pattern(large.size, 99);
        auto overwrite = [stream, value, count = large.count, next = 0]() mutable {
            Require(MAVOEASWrite(stream->handle(), NameOf(next).c_str(), value.data(),
                                 static_cast<unsigned>(value.size()), 0,
                                 EAS_WRITE_OVERWRITE) == static_cast<int>(value.size()),
                    "cannot overwrite an attribute");
            next = (next + 1) % count;
        };
        overwrite();
        Require(stream->Content() == ImageAfterFirst(large, value).Build(),
                "not the stream that is due after an overwrite");
        return Repeat(overwrite);
    };
}

Prepare OverwritingTheFirstByHand(const Place& place, const Large& large) {
    return [place, large] {
        const std::string path = place.NewPath();
        test::WriteFile(path, ImageOf(large, test::Pattern(large.size)).Build());
        const auto file = std::make_shared<File>(path, O_RDWR);
        const Bytes image = ImageAfterFirst(large, test::Pattern(large.size, 99)).Build();
        const std::size_t head = image.size() - static_cast<std::size_t>(large.count) * large.size;
        const auto overwrite = [file, whole = std::make_shared<Bytes>(image), head,
                                size = large.size] {
            Require(floor::CloseUpAndWriteDurably(file->fd(), *whole, head, size),
                    "cannot write a file");
        };
        overwrite();
        Require(file->Read(0, image.size() + 1) == image,
                "not the stream that is due after an overwrite");
        return Repeat(overwrite);
    };
}

// ---- Looking for a stream -----------------------------------------------------------------------

bool FindsNothing(const char* object) {
    return MAVOEAOpen(EA_FORM_FILE, object, MAVOEA_KIND_STREAM, O_RDONLY, EA_PLACE_EADIR) < 0;
}

// An object without metadata, beside one that has some.
template <class LooksFor>
Prepare Missing(const Place& place, LooksFor finds_nothing) {
    return [place, finds_nothing] {
        const std::string object = NewObject(place) + ".without";
        test::WriteFile(object, {});
        Require(finds_nothing(object.c_str()), "an object without metadata has some");
        return Repeat([object, finds_nothing] {
            Require(finds_nothing(object.c_str()), "an object without metadata has some");
        });
    };
}

// ---- Listing
// --------------------------------------------------------------------------------------

int ListThroughLibrary(const char* path, MLIBCSzList** list) {
    const int fd = open(path, O_RDONLY);
    EASHandle* const h = MAVOEASOpen(fd, F_UNLCK);
    const int count = MAVOEASEnum(h, list);
    MAVOEASClose(h);
    close(fd);
    return count;
}

template <class ListNames>
Prepare Listing(const Place& place, ListNames list_names) {
    return [place, list_names] {
        const std::string path = NewStream(place, kMany);
        const auto list = std::make_shared<List>();
        Require(list_names(path.c_str(), list->get()) == kMany && list->Holds(kMany),
                "not the names that are due");
        return Repeat([path, list, list_names] {
            list->Clear();
            benchmark::DoNotOptimize(list_names(path.c_str(), list->get()));
        });
    };
}

Prepare EnumeratingThroughLibrary(const Place& place) {
    return [place] {
        const auto stream = std::make_shared<Stream>(NewStream(place, kMany), O_RDONLY, F_UNLCK);
        const auto list = std::make_shared<List>();
        Require(MAVOEASEnum(stream->handle(), list->get()) == kMany && list->Holds(kMany),
                "not the names that are due");
        return Repeat([stream, list] {
            list->Clear();
            benchmark::DoNotOptimize(MAVOEASEnum(stream->handle(), list->get()));
        });
    };
}

Prepare EnumeratingByHand() {
    return [] {
        const auto image = std::make_shared<StreamImage>(ImageOf(kMany));
        const auto list = std::make_shared<List>();
        const auto push_all = [image, list] {
            list->Clear();
            for (const Attribute& attribute : image->attributes) {
                MLIBCSzListPush(list->get(), attribute.name.c_str());
            }
        };
        push_all();
        Require(list->Holds(kMany), "not the names that are due");
        return Repeat(push_all);
    };
}

// ---- Filling a stream
// -----------------------------------------------------------------------------

// One attribute at a time into a new stream; from an empty file again when all are written.
class Filler {
 public:
    Filler(std::string path, int count) : path_(std::move(path)), image_(ImageOf(count)) {}

    void WriteNext() {
        if (next_ == 0) {
            stream_.reset();
            stream_ = std::make_unique<Stream>(path_, O_RDWR | O_CREAT | O_TRUNC, F_WRLCK);
        }
        const Attribute& attribute = image_.attributes[next_];
        next_ = (next_ + 1) % image_.attributes.size();
        Require(MAVOEASWrite(stream_->handle(), attribute.name.c_str(), attribute.value.data(),
                             kValueSize, 0, 0) == kValueSize,
                "cannot write an attribute");
    }

    Bytes Content() const { return stream_->Content(); }

 private:
    std::string path_;
    StreamImage image_;
    std::unique_ptr<Stream> stream_;
    std::size_t next_ = 0;
};

// As many bytes as the library writes each time: those that the last time leaves.
class PlainFiller {
 public:
    PlainFiller(std::string path, int count)
        : path_(std::move(path)),
          bytes_(ImageOf(count).Build()),
          count_(static_cast<std::size_t>(count)),
          each_((bytes_.size() - test::kTableAt) / count_) {}

    void WriteNext() {
        if (next_ == 0) {
            file_.reset();
            file_ = std::make_unique<File>(path_, O_RDWR | O_CREAT | O_TRUNC);
        }
        next_ = (next_ + 1) % count_;
        const std::size_t size = test::kTableAt + (next_ == 0 ? count_ : next_) * each_;
        Require(floor::WriteDurably(file_->fd(), std::span(bytes_).first(size)),
                "cannot write a file");
    }

    Bytes Content() const { return file_->Read(0, static_cast<std::size_t>(file_->Size())); }

 private:
    std::string path_;
    Bytes bytes_;
    std::size_t count_;
    std::size_t each_;  // what one of them takes
    std::unique_ptr<File> file_;
    std::size_t next_ = 0;
};

// The whole stream is written and looked at once, on the fast filesystem: a disk takes seconds.
template <class AnyFiller>
Prepare Filling(const Place& place, const Place& fast, int count) {
    return [place, fast, count] {
        AnyFiller checked(fast.NewPath(), count);
        for (int i = 0; i < count; ++i) checked.WriteNext();
        Require(checked.Content() == ImageOf(count).Build(), "not the stream that is due");
        const auto filler = std::make_shared<AnyFiller>(place.NewPath(), count);
        return Repeat([filler] { filler->WriteNext(); });
    };
}

}  // namespace

void AddListRows(const Place& fast, std::vector<Row>* rows) {
    rows->push_back({.work = "enumerate 1,000 names of an open stream",
                     .where = "memory",
                     .aim = 2.5,
                     .library = EnumeratingThroughLibrary(fast),
                     .floor = EnumeratingByHand()});
}

void AddStreamRows(const Place& place, const Place& fast, std::vector<Row>* rows) {
    struct {
        int count;
        const char* title;
        double aim;
    } const kinds[] = {{1, "open, read 1 of 1 value, close", 1.6},
                       {10, "open, read 1 of 10 values, close", 1.6},
                       {100, "open, read 1 of 100 values, close", 1.75},
                       {kMany, "open, read 1 of 1,000 values, close", 2.2}};
    for (const auto& kind : kinds) {
        rows->push_back({.work = kind.title,
                         .where = place.name,
                         .aim = kind.aim,
                         .library = Reading(place, kind.count, ReadThroughLibrary),
                         .floor = Reading(place, kind.count, floor::ReadValue)});
    }
    rows->push_back({.work = "look for a stream where there is no metadata",
                     .where = place.name,
                     .aim = 1.6,
                     .library = Missing(place, FindsNothing),
                     .floor = Missing(place, floor::HasNoStream)});
    rows->push_back({.work = "open, enumerate 1,000 names, close",
                     .where = place.name,
                     .aim = 1.3,
                     .library = Listing(place, ListThroughLibrary),
                     .floor = Listing(place, floor::ListNames)});
    rows->push_back({.work = "durable overwrite, 1 of 10 values",
                     .where = place.name,
                     .aim = place.durable ? 1.15 : 3,
                     .library = OverwritingThroughLibrary(place),
                     .floor = OverwritingByHand(place),
                     .waits = place.durable});
    rows->push_back({.work = "open to write, set 1 of 10 values durably, close",
                     .where = place.name,
                     .aim = place.durable ? 1.15 : 1.5,
                     .library = SettingThroughLibrary(place),
                     .floor = SettingByHand(place),
                     .waits = place.durable});
    for (const Large& large : kLarge) {
        rows->push_back({.work = large.first,
                         .where = place.name,
                         .aim = 1.3,
                         .library = OverwritingTheFirstThroughLibrary(place, large),
                         .floor = OverwritingTheFirstByHand(place, large),
                         .waits = place.durable});
        if (!place.durable) continue;  // beside a sync that does nothing, it is all memory
        rows->push_back({.work = large.last,
                         .where = place.name,
                         .aim = 1.1,
                         .library = OverwritingTheLastThroughLibrary(place, large),
                         .floor = OverwritingTheLastByHand(place, large),
                         .waits = true});
    }
    for (const int count : {100, kMany}) {
        rows->push_back({.work = count == kMany ? "1,000 attributes one by one, each"
                                                : "100 attributes one by one, each",
                         .where = place.name,
                         .aim = place.durable ? 1.2 : 1.3,
                         .library = Filling<Filler>(place, fast, count),
                         .floor = Filling<PlainFiller>(place, fast, count),
                         .waits = place.durable,
                         .batch = 10,
                         .goes = count / 10});
    }
}

}  // namespace mavoea::bench

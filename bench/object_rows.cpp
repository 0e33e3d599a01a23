// What file services do to objects: renaming, removing and copying their metadata.

#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "bench/rows.h"
#include "include/mavoea.h"
#include "tests/support/stream_builder.h"

namespace mavoea::bench {
namespace {

constexpr int kEADirVolume = 1;
constexpr const char* kKinds[] = {MAVOEA_KIND_RESOURCE, MAVOEA_KIND_STREAM};

// A directory of `count` objects, each with both metadata files.
class Objects {
 public:
    Objects(const Place& place, int count) : directory_(place.NewPath()), count_(count) {
        std::filesystem::create_directories(directory_ + "/@eaDir");
        for (int i = 0; i < count; ++i) {
            for (const char* kind : kKinds) {
                test::WriteFile(Metadata(Path(i), kind), test::Pattern(300));
            }
        }
    }
    ~Objects() { std::filesystem::remove_all(directory_); }
    Objects(const Objects&) = delete;
    Objects& operator=(const Objects&) = delete;

    int count() const { return count_; }
    std::string Path(int index) const {
        return directory_ + "/object " + std::to_string(index) + ".txt";
    }
    std::string NewPath(int index) const { return Path(index) + ".renamed"; }

    static std::string Metadata(const std::string& path, const char* kind) {
        const auto name = path.rfind('/') + 1;
        return path.substr(0, name) + "@eaDir/" + path.substr(name) + "@" + kind;
    }

    bool HasMetadata(const std::string& path) const {
        return test::Exists(Metadata(path, MAVOEA_KIND_RESOURCE)) &&
               test::Exists(Metadata(path, MAVOEA_KIND_STREAM));
    }

 private:
    std::string directory_;
    int count_;
};

// ---- The archive mark ---------------------------------------------------------------------------

// Sets it as a host keeps it, unless it is set. Of a file that has no DOS attributes, in which it
// would be as well.
void MarkByHand(const std::string& path) {
    constexpr char kName[] = "user.mavo.attributes";
    constexpr unsigned char kArchive[] = {0, 0, 0, 1};
    unsigned char word[sizeof kArchive] = {};
    unsigned char dos[256];
    Require(getxattr(path.c_str(), "user.DOSATTRIB", dos, sizeof dos) < 0, "a file of Samba's");
    if (getxattr(path.c_str(), kName, word, sizeof word) == sizeof word &&
        std::equal(std::begin(word), std::end(word), std::begin(kArchive))) {
        return;
    }
    (void)setxattr(path.c_str(), kName, kArchive, sizeof kArchive, 0);
}

// ---- Renaming -----------------------------------------------------------------------------------

void RenameThroughLibrary(const std::string& from, const std::string& to) {
    EAIndexFlags neither = {.fileIndex = 0, .index = 0};
    Require(MAVOEARename(from.c_str(), to.c_str(), kEADirVolume, &neither) == 0, "cannot rename");
}

void RenameByHand(const std::string& from, const std::string& to) {
    for (const char* kind : kKinds) {
        Require(
            rename(Objects::Metadata(from, kind).c_str(), Objects::Metadata(to, kind).c_str()) == 0,
            "cannot rename");
    }
    MarkByHand(to);
}

// Renames one object after the other, and back again in the next round.
template <class Rename>
Prepare Renaming(const Place& place, int count, Rename rename_one) {
    return [place, count, rename_one] {
        const auto objects = std::make_shared<Objects>(place, count);
        // The objects are wherever they are looked for.
        for (int i = 0; i < count; ++i) {
            test::WriteFile(objects->Path(i), {});
            test::WriteFile(objects->NewPath(i), {});
        }
        rename_one(objects->Path(0), objects->NewPath(0));
        Require(
            objects->HasMetadata(objects->NewPath(0)) && !objects->HasMetadata(objects->Path(0)),
            "the metadata is not at its new name");
        rename_one(objects->NewPath(0), objects->Path(0));
        int next = 0;
        bool back = false;
        return Repeat([objects, rename_one, next, back]() mutable {
            const std::string one = objects->Path(next);
            const std::string other = objects->NewPath(next);
            rename_one(back ? other : one, back ? one : other);
            if (++next == objects->count()) {
                next = 0;
                back = !back;
            }
        });
    };
}

// ---- Removing -----------------------------------------------------------------------------------

void RemoveThroughLibrary(const std::string& path) {
    EAIndexFlags neither = {.fileIndex = 0, .index = 0};
    Require(MAVOEARemove(path.c_str(), kEADirVolume, &neither) == 0, "cannot remove");
}

void RemoveByHand(const std::string& path) {
    for (const char* kind : kKinds) {
        Require(unlink(Objects::Metadata(path, kind).c_str()) == 0, "cannot remove");
    }
    MarkByHand(path);
}

constexpr int kRemoved = 400;

template <class Remove>
Prepare Removing(const Place& place, int count, Remove remove_one) {
    return [place, count, remove_one] {
        const auto objects = std::make_shared<Objects>(place, count);
        remove_one(objects->Path(count - 1));
        Require(!test::Exists(Objects::Metadata(objects->Path(count - 1), kKinds[0])) &&
                    objects->HasMetadata(objects->Path(0)),
                "not the metadata of one object has been removed");
        int next = 0;
        return Repeat([objects, remove_one, next]() mutable {
            remove_one(objects->Path(next));
            ++next;
        });
    };
}

// ---- Copying ------------------------------------------------------------------------------------

// The plainest copy of a small file.
int CopyFile(const char* from, const char* to) {
    char bytes[4096];
    const int in = open(from, O_RDONLY | O_CLOEXEC);
    const ssize_t size = read(in, bytes, sizeof bytes);
    close(in);
    const int out = open(to, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
    const ssize_t written = write(out, bytes, static_cast<size_t>(size));
    close(out);
    return written == size ? 0 : -1;
}

void CopyThroughLibrary(const std::string& from, const std::string& to) {
    std::string writable = to;
    Require(MAVOEACopyEx(from.c_str(), writable.data(), 0, 0, kEADirVolume, kEADirVolume, 0, 0,
                         CopyFile) == 0,
            "cannot copy");
}

void CopyByHand(const std::string& from, const std::string& to) {
    for (const char* kind : kKinds) {
        const std::string target = Objects::Metadata(to, kind);
        Require(CopyFile(Objects::Metadata(from, kind).c_str(), target.c_str()) == 0,
                "cannot copy");
        Require(chmod(target.c_str(), 0777) == 0, "cannot copy");
    }
}

// Copies one object after the other, over what the round before has copied.
template <class Copy>
Prepare Copying(const Place& place, Copy copy_one) {
    return [place, copy_one] {
        const auto objects = std::make_shared<Objects>(place, 100);
        copy_one(objects->Path(0), objects->NewPath(0));
        for (const char* kind : kKinds) {
            Require(
                test::ReadFile(Objects::Metadata(objects->NewPath(0), kind)) == test::Pattern(300),
                "not the copy that is due");
        }
        int next = 0;
        return Repeat([objects, copy_one, next]() mutable {
            copy_one(objects->Path(next), objects->NewPath(next));
            next = (next + 1) % objects->count();
        });
    };
}

}  // namespace

void AddObjectRows(const Place& place, std::vector<Row>* rows) {
    constexpr double kAim = 1.3;
    for (const int count : {1000, 20000}) {
        const std::string among = " among " + std::to_string(count);
        rows->push_back({.work = "rename an object" + among,
                         .where = place.name,
                         .aim = kAim,
                         .library = Renaming(place, count, RenameThroughLibrary),
                         .floor = Renaming(place, count, RenameByHand)});
        rows->push_back({.work = "remove an object" + among,
                         .where = place.name,
                         .aim = kAim,
                         .library = Removing(place, count, RemoveThroughLibrary),
                         .floor = Removing(place, count, RemoveByHand),
                         .batch = kRemoved,
                         .consumes = true});
    }
    rows->push_back({.work = "copy an object's metadata, in process",
                     .where = place.name,
                     .aim = place.durable ? 1.3 : 1.4,
                     .library = Copying(place, CopyThroughLibrary),
                     .floor = Copying(place, CopyByHand)});
}

}  // namespace mavoea::bench

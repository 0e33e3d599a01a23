#include "tools/store/reader.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>

#include "format/finder_info.h"
#include "format/netatalk_record.h"
#include "tools/store/apple_double_reader.h"
#include "tools/store/by_kind.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/foreign/reader.h"
#include "tools/store/gathering.h"
#include "tools/store/layout.h"
#include "tools/store/marks.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;
using Names = std::vector<std::string>;

void AddService(const Found& found, const std::string& name, Metadata* metadata) {
    Noting(metadata, [&] {
        const auto file = found.directory->FindFile(found.name, O_RDONLY);
        if (file) {
            metadata->services.push_back({name, Content(file, 0, file->Size()), file->path()});
        }
    });
}

void AddServices(const Sidecars& sidecars, Metadata* metadata) {
    for (const Sidecars::Service& service : sidecars.services) {
        AddService(service.found, service.name, metadata);
    }
    for (const Found& other : sidecars.others) {
        if (S_ISDIR(other.info.st_mode)) continue;  // what is in it comes by itself
        metadata->strays.push_back(
            {Printable(other.path()), "it is no regular file", other.path()});
    }
}

// Files of the legacy folder where it means nothing: they stay what they are.
void AddFolder(const Sidecars& sidecars, Metadata* metadata) {
    for (const Found& file : sidecars.attribute_files) {
        AddService(file, '/' + file.name, metadata);
    }
    if (const auto& file = sidecars.legacy_resource) {
        AddService(*file, '/' + file->name, metadata);
    }
}

// One for each kind of place.
class Reader {
 public:
    virtual ~Reader() = default;
    virtual Metadata Read(const Inode& inode, const Names& attributes,
                          const Sidecars& sidecars) const = 0;
};

// ---- Volumes that keep one "._" file ------------------------------------------------------------

class AppleDoubleReader final : public Reader {
 public:
    Metadata Read(const Inode&, const Names&, const Sidecars& sidecars) const override {
        Metadata metadata;
        if (sidecars.apple_double) {
            metadata.whole_apple_double = ReadFound(*sidecars.apple_double, &metadata);
        }
        AddServices(sidecars, &metadata);
        AddFolder(sidecars, &metadata);
        return metadata;
    }
};

// ---- Volumes that keep an EA directory ----------------------------------------------------------

class EaDirectoryReader : public Reader {
 public:
    Metadata Read(const Inode& inode, const Names&, const Sidecars& sidecars) const override {
        Metadata metadata;
        ReadFirst(inode, &metadata);
        if (sidecars.resource) {
            metadata.whole_resource = ReadFound(*sidecars.resource, &metadata);
        } else if (sidecars.legacy_resource) {
            // It is of the same kind, whatever is in it.
            metadata.whole_resource = ReadFound(*sidecars.legacy_resource, &metadata);
            metadata.earlier.push_back(sidecars.legacy_resource->path());
            metadata.hidden = metadata.hidden || SaysInvisible(metadata);
        }
        if (sidecars.resource && sidecars.legacy_resource) {
            AddService(*sidecars.legacy_resource, '/' + sidecars.legacy_resource->name, &metadata);
        }
        ReadAttributes(sidecars, &metadata);
        AddServices(sidecars, &metadata);
        return metadata;
    }

 protected:
    // What counts before the files in the EA directory.
    virtual void ReadFirst(const Inode&, Metadata*) const {}

 private:
    static void ReadEarlier(const Found& found, Metadata* metadata) {
        (void)ReadFound(found, metadata);
        metadata->earlier.push_back(found.path());
    }

    // A stream; or what earlier versions kept in its place: files of one attribute each, or a "._"
    // file, whichever was read last.
    static void ReadAttributes(const Sidecars& sidecars, Metadata* metadata) {
        const auto& files = sidecars.attribute_files;
        time_t read = 0;
        for (const Found& file : files) read = std::max(read, file.info.st_atim.tv_sec);
        const bool apple_double_wins =
            sidecars.apple_double &&
            (files.empty() || sidecars.apple_double->info.st_atim.tv_sec >= read);
        if (sidecars.stream) {
            metadata->whole_stream = ReadFound(*sidecars.stream, metadata);
        } else if (apple_double_wins) {
            ReadEarlier(*sidecars.apple_double, metadata);
        } else {
            for (const Found& file : files) ReadAttributeFile(file, metadata);
        }
        const bool files_win = !sidecars.stream && !apple_double_wins;
        for (const Found& file : files) {
            if (!files_win) AddService(file, '/' + file.name, metadata);
        }
        if (sidecars.apple_double && (sidecars.stream || !apple_double_wins)) {
            AddService(*sidecars.apple_double, "._", metadata);
        }
    }

    static void ReadAttributeFile(const Found& found, Metadata* metadata) {
        Noting(metadata, [&] {
            const auto file = found.directory->FindFile(found.name, O_RDONLY);
            if (!file) return;
            metadata->attributes.push_back(
                {found.name, Content(file, 0, file->Size()), 0, file->path()});
            metadata->earlier.push_back(file->path());
        });
    }

    static bool SaysInvisible(const Metadata& metadata) {
        if (metadata.finder_info && !metadata.finder_info->value.damaged()) {
            const Bytes info = metadata.finder_info->value.All();
            const auto view = FinderInfoView(info.begin(), kFinderInfoSize);
            if ((DecodeFileFinderInfo(view).item.flags & kFinderInvisible) != 0) return true;
        }
        return (metadata.AfpAttributes().value_or(0) & kAfpInvisible) != 0;
    }
};

// ---- Volumes that keep a record with the object as well -----------------------------------------

class FileEaReader final : public EaDirectoryReader {
 protected:
    void ReadFirst(const Inode& inode, Metadata* metadata) const override {
        Noting(metadata, [&] {
            if (!inode.HoldsContents()) return;
            metadata->whole_record = inode.Attribute(kNetatalkAttribute);
            if (metadata->whole_record) {
                ReadRecord(*metadata->whole_record, {inode.path()}, metadata);
            }
        });
    }
};

// ---- Volumes that keep extended attributes ------------------------------------------------------

class AttributeReader final : public Reader {
 public:
    Metadata Read(const Inode& inode, const Names& attributes,
                  const Sidecars& sidecars) const override {
        Metadata metadata;
        AddServices(sidecars, &metadata);
        AddFolder(sidecars, &metadata);
        if (const auto& file = sidecars.resource) {
            metadata.strays.push_back({Printable(file->path()),
                                       "volumes of the source's type keep no such file",
                                       file->path()});
        }
        for (const std::string& name : attributes) {
            if (IsMark(name) || IsOfTheSystem(name)) continue;
            Noting(&metadata, [&] { ReadAttribute(inode, name, &metadata); });
        }
        if (S_ISREG(inode.info().st_mode)) {
            Noting(&metadata, [&] { ReadFork(inode, &metadata); });
        }
        return metadata;
    }

 private:
    static bool IsOfTheSystem(std::string_view name) {
        return name.starts_with("system.") || name.starts_with("security.") ||
               name.starts_with("trusted.");
    }

    static void ReadAttribute(const Inode& inode, const std::string& name, Metadata* metadata) {
        auto value = inode.Attribute(name);
        if (!value) return;
        if (KindOf(name) == Kind::kFinderInfo && value->size() == kFinderInfoSize) {
            if (IsAllZero(*value)) return;
            metadata->finder_info = Metadata::Item{Content(*std::move(value)), inode.path()};
        } else {
            metadata->attributes.push_back({name, Content(*std::move(value)), 0, inode.path()});
        }
    }

    // File systems with forks show it beneath the file; others say that the file is no directory.
    static void ReadFork(const Inode& inode, Metadata* metadata) {
        const std::string path = inode.ProcPath() + "/rsrc";
        constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
        auto file = std::make_shared<File>(OpenQuietly(AT_FDCWD, path.c_str(), kFlags),
                                           inode.path() + "/rsrc");
        if (file->fd() < 0) {
            if (errno == ENOTDIR || errno == ENOENT) return;
            throw SystemFailure(file->path(), errno);
        }
        Content fork(file, 0, file->Size());
        if (fork.size() == 0) return;
        metadata->fork = Metadata::Item{std::move(fork), file->path()};
    }
};

// What another program keeps of an object where nobody has said that it does.
void AddUndeclared(const Inode& inode, const std::vector<std::string>& names, Metadata* metadata) {
    const auto sign = SignIn(names);
    if (!sign) return;
    AddForeignAttributes(*sign->dialect, inode, names, Certainty::kCertain, metadata);
    AddForeignAttributes(AnyDialect(), inode, names, Certainty::kCertain, metadata);
    TakeMarksFromWord(metadata);
}

}  // namespace

Metadata ReadMetadata(const Object& object, const Inode& inode, const Sidecars& sidecars) {
    Metadata metadata;
    std::vector<std::string> names;
    std::optional<Failure> unlisted;
    if (inode.HoldsContents()) {
        try {
            names = inode.AttributeNames();
        } catch (const Failure& failure) {
            unlisted = failure;
        }
    }
    const auto* const reader =
        OneFor<Reader, AppleDoubleReader, EaDirectoryReader, FileEaReader, AttributeReader>(
            object.kind());
    if (const Dialect* const dialect = object.dialect()) {
        metadata = ReadForeign(*dialect, inode, names, sidecars);
        AddServices(sidecars, &metadata);
        AddFolder(sidecars, &metadata);
    } else if (reader != nullptr && !object.is_root()) {
        metadata = reader->Read(inode, names, sidecars);
    }
    if (sidecars.problem) metadata.problems.push_back(*sidecars.problem);
    if (unlisted) metadata.problems.push_back(*unlisted);
    if (!inode.HoldsContents() || unlisted) return metadata;
    if (const std::string depot = FindDepot(object, &inode, names); !depot.empty()) {
        metadata.problems.push_back(DepotIsUnknown(object, depot));
    }
    if (reader != nullptr && !object.is_root() && !object.declared) {
        Noting(&metadata, [&] { AddUndeclared(inode, names, &metadata); });
    }
    Noting(&metadata, [&] { ReadMarks(object, inode, names, &metadata); });
    return metadata;
}

namespace {

// That of a file which has nothing but its mode, without opening it. None for any other.
std::optional<Metadata> ReadBare(const Object& object, const Sidecars& sidecars) {
    const Place& place = object.place;
    if (!S_ISREG(place.directory->TypeAtFirst(place.name))) return std::nullopt;
    if (sidecars.Any() || sidecars.problem) return std::nullopt;
    // Elsewhere most files have some attribute, or a fork may be beneath the file itself.
    const bool beside =
        object.keeping() == Keeping::kAppleDouble || object.keeping() == Keeping::kEaDirectory;
    if (!beside || object.dialect() != nullptr) return std::nullopt;
    if (!place.directory->HasWithoutAttributes(place.name)) return std::nullopt;
    Metadata metadata;
    if (const std::string depot = FindDepot(object, nullptr, {}); !depot.empty()) {
        metadata.problems.push_back(DepotIsUnknown(object, depot));
    }
    metadata.locked = LocksByMode(object) && (StatusOf(place).st_mode & kWriteBits) == 0;
    return metadata;
}

}  // namespace

Metadata ReadMetadata(const Object& object, const Sidecars& sidecars) {
    if (auto bare = ReadBare(object, sidecars)) return *std::move(bare);
    return ReadMetadata(object, *Inode::Open(object.place), sidecars);
}

Metadata ReadMetadata(const Object& object, Sidecars::Services services) {
    return ReadMetadata(object, Sidecars::Find(object, services));
}

Metadata ReadAppleDoubleFile(std::shared_ptr<const File> file) {
    Metadata metadata;
    if (!ReadLayout(*file).IsAppleDouble()) {
        throw Failure(kFailed, file->path(), "no AppleDouble file",
                      "look at it with: mavoea dump FILE");
    }
    ReadFile(std::move(file), &metadata);
    if (!metadata.problems.empty()) throw Failure(metadata.problems.front());
    return metadata;
}

}  // namespace mavoea::tool

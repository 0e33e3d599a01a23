#include "tools/store/reader.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>

#include "format/ea_stream.h"
#include "format/netatalk_record.h"
#include "tools/store/by_kind.h"
#include "tools/store/layout.h"
#include "tools/store/locking.h"
#include "tools/store/marks.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;

constexpr const char* kLook = "look at it with: mavoea dump FILE";
constexpr const char* kLookAtRecord = "look at it with: mavoea dump --record PATH";

// netatalk's own entries name the file that they are in, and mean nothing in another.
bool IsPrivate(EntryId id) {
    return SlotOf(static_cast<std::uint32_t>(id)) >= Slot::kPrivateDevice;
}

// ---- One AppleDouble file -----------------------------------------------------------------------

// Adds what a file holds to what is known: what is known already stays, and another value of it is
// a stray.
class FileReader {
 public:
    FileReader(std::shared_ptr<const File> file, Metadata* metadata)
        : file_(std::move(file)), layout_(ReadLayout(*file_)), metadata_(*metadata) {}

    void Read() {
        if (layout_.file_size == 0) return;  // made, and not written yet
        if (!layout_.IsAppleDouble()) {
            return Problem("no AppleDouble file",
                           "move it away, or look at it with: mavoea dump FILE");
        }
        const AppleDoubleHeader& header = *layout_.header;
        if (header.version != kAppleDoubleVersion2) {
            return Problem("its AppleDouble version is " + HexNumber(header.version) + ", not " +
                               HexNumber(kAppleDoubleVersion2),
                           kLook);
        }
        if (layout_.entries.size() < header.entry_count) Damaged("its descriptors pass");
        if (header.entry_count > kStreamDescriptorMax) {
            Problem("damaged: it declares " + std::to_string(header.entry_count) + " entries",
                    kLook);
        }
        ReadFinderInfo();
        ReadAttributes();
        ReadFork();
        ReadEntries();
    }

 private:
    void Problem(const std::string& cause, const char* advice) {
        metadata_.problems.emplace_back(kFailed, file_->path(), cause, advice);
    }
    void Damaged(const std::string& what) {
        Problem("damaged: " + what + " the end of the file", kLook);
    }
    void Stray(const std::string& item, const std::string& reason) {
        metadata_.strays.push_back(
            {item + " in " + Printable(file_->path()), reason, file_->path()});
    }

    Content Stretch(Range range) const { return {file_, range.offset, range.length}; }

    // What passes the file's end is there all the same, so that nobody takes it for missing.
    void Take(std::optional<Metadata::Item>* item, const std::string& name, Content value,
              const char* passes) {
        if (value.damaged()) Damaged(passes);
        if (!*item) {
            *item = Metadata::Item{std::move(value), file_->path()};
        } else if (Differs((*item)->value, value)) {
            Stray("a second " + name, "it is another one than in " + Printable((*item)->holder));
        }
    }
    static bool Differs(const Content& one, const Content& other) {
        if (one.damaged() || other.damaged()) return true;
        return one.size() != other.size() || FirstDifference(one, other).has_value();
    }

    void ReadFinderInfo() {
        const auto index = layout_.FindEntry(EntryId::kFinderInfo);
        if (!index || layout_.entries[*index].data.length == 0) return;
        Range range = layout_.entries[*index].data;
        if (range.length < kFinderInfoSize) {
            return Stray("Finder info", "it has fewer bytes than it should");
        }
        range.length = kFinderInfoSize;
        Content value = Stretch(range);
        if (!value.damaged() && IsAllZero(value.All())) return;
        Take(&metadata_.finder_info, "Finder info", std::move(value), "its Finder info passes");
    }

    void ReadAttributes() {
        if (!layout_.HasAttributeArea()) return;
        if (!layout_.attributes || layout_.attributes->magic != kAttributeMagic) {
            return Stray("what is behind the Finder info", "it is of no known kind");
        }
        if (layout_.records.size() < layout_.attributes->count) {
            Damaged("its attribute table passes");
        }
        std::uint64_t total = 0;
        for (const Layout::Record& record : layout_.records) {
            const std::string name = record.name();
            if (name.empty() || name.size() >= kNameSizeMax) {
                Problem("damaged: an attribute has no name", kLook);
                continue;
            }
            // Values that share bytes could make much of little.
            total += record.fixed.value.length;
            Content value =
                total > layout_.file_size && record.fixed.value.length > 0
                    ? Content::Damaged(record.fixed.value.length,
                                       "it passes the end of " + Printable(file_->path()))
                    : Stretch(record.fixed.value);
            if (value.damaged()) Damaged("attribute " + NameOfAttribute(name) + " passes");
            AddAttribute({name, std::move(value), record.fixed.flags, file_->path()});
        }
    }

    // Of two of one name in one file the last is meant.
    void AddAttribute(Metadata::Attribute attribute) {
        auto& all = metadata_.attributes;
        const auto other = std::find_if(
            all.begin(), all.end(),
            [&](const Metadata::Attribute& one) { return one.name == attribute.name; });
        if (other == all.end()) {
            all.push_back(std::move(attribute));
        } else if (other->holder == attribute.holder) {
            *other = std::move(attribute);
        } else if (Differs(other->value, attribute.value)) {
            Stray("a second " + NameOfAttribute(attribute.name),
                  "it is another one than in " + Printable(other->holder));
            metadata_.strays.back().attribute = true;
        }
    }

    void ReadFork() {
        const auto index = layout_.FindEntry(EntryId::kResourceFork);
        if (!index || layout_.entries[*index].data.length == 0) return;
        Content value = Stretch(layout_.entries[*index].data);
        auto& known = metadata_.fork;
        if (known && IsBlankFork(value)) return;
        if (known && IsBlankFork(known->value)) known.reset();
        Take(&metadata_.fork, "resource fork", std::move(value), "its resource fork passes");
    }

    void ReadEntries() {
        for (std::size_t i = 0; i < layout_.entries.size(); ++i) {
            const EntryDescriptor& entry = layout_.entries[i];
            const bool known = entry.id == EntryId::kFinderInfo ||
                               entry.id == EntryId::kResourceFork || entry.id == EntryId::kNone;
            if (known || entry.data.length == 0 || IsPrivate(entry.id)) continue;
            if (layout_.FindEntry(entry.id) != i) continue;
            Content value = Stretch(entry.data);
            if (!value.damaged() && !Speaks(entry.id, value)) continue;
            std::optional<Metadata::Item> item;
            if (const auto other = metadata_.entries.find(entry.id);
                other != metadata_.entries.end()) {
                item = other->second;
            }
            Take(&item, NameOfEntry(entry.id), std::move(value), "an entry passes");
            metadata_.entries.insert_or_assign(entry.id, *std::move(item));
        }
    }

    // The lock is kept as it is; what else says nothing is left out.
    static bool Speaks(EntryId id, const Content& value) {
        const Bytes bytes = value.All();
        return id == EntryId::kAfpFileInfo ? !IsAllZero(bytes) : SaysSomething(id, bytes);
    }

    std::shared_ptr<const File> file_;
    Layout layout_;
    Metadata& metadata_;
};

// Runs `work`, which throws what is wrong with one file.
template <class Work>
void Noting(Metadata* metadata, Work work) {
    try {
        work();
    } catch (const Failure& failure) {
        metadata->problems.push_back(failure);
    }
}

// Reads the file that was found, if it is still there; null when not, or when it is none.
// One that is small is read at once.
WholeFile ReadFound(const Found& found, Metadata* metadata) {
    WholeFile file;
    Noting(metadata, [&] {
        file = found.file ? found.file : found.directory->FindFile(found.name, O_RDONLY);
        if (!file) return;
        if (!file->keeps_contents()) {
            LockFile(*file, Access::kRead);
            (void)file->KeepContents(kSmallFile);
        }
        FileReader(file, metadata).Read();
    });
    return file;
}

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
    virtual Metadata Read(const Inode& inode, const Sidecars& sidecars) const = 0;
};

// ---- Volumes that keep one "._" file ------------------------------------------------------------

class AppleDoubleReader final : public Reader {
 public:
    Metadata Read(const Inode&, const Sidecars& sidecars) const override {
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
    Metadata Read(const Inode& inode, const Sidecars& sidecars) const override {
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
            if ((LoadBe16(&info[kFinderFlagsOffset]) & kFinderInvisible) != 0) return true;
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
            if (metadata->whole_record) ReadRecord(inode.path(), metadata);
        });
    }

 private:
    static void ReadRecord(const std::string& path, Metadata* metadata) {
        const Bytes& block = *metadata->whole_record;
        const Layout layout = ReadLayout(ByteView(block));
        if (!CheckRecord(layout, RecordPlace::kAttribute).violations.empty()) {
            throw Failure(kFailed, path, "its netatalk record is damaged", kLookAtRecord);
        }
        const auto bytes = [&](Range range) {
            const ByteView part = ByteView(block).subspan(range.offset, range.length);
            return Bytes(part.begin(), part.end());
        };
        for (std::size_t i = 0; i < layout.entries.size(); ++i) {
            const EntryDescriptor& entry = layout.entries[i];
            const Range range = entry.data;
            if (range.length == 0 || range.end() > block.size() || IsPrivate(entry.id)) continue;
            if (entry.id == EntryId::kFinderInfo) {
                const Bytes info = bytes({range.offset, std::uint32_t{kFinderInfoSize}});
                if (!IsAllZero(info)) metadata->finder_info = Metadata::Item{Content(info), path};
            } else if (const Bytes value = bytes(range);
                       !IsAllZero(value) &&
                       (entry.id == EntryId::kAfpFileInfo || SaysSomething(entry.id, value))) {
                metadata->entries[entry.id] = {Content(value), path};
            }
        }
    }
};

// ---- Volumes that keep extended attributes ------------------------------------------------------

class AttributeReader final : public Reader {
 public:
    Metadata Read(const Inode& inode, const Sidecars& sidecars) const override {
        Metadata metadata;
        AddServices(sidecars, &metadata);
        AddFolder(sidecars, &metadata);
        if (const auto& file = sidecars.resource) {
            metadata.strays.push_back({Printable(file->path()),
                                       "volumes of the source's type keep no such file",
                                       file->path()});
        }
        if (!inode.HoldsContents()) return metadata;
        for (const std::string& name : inode.AttributeNames()) {
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

}  // namespace

Metadata ReadMetadata(const Object& object, const Inode& inode, const Sidecars& sidecars) {
    Metadata metadata;
    const auto* const reader =
        OneFor<Reader, AppleDoubleReader, EaDirectoryReader, FileEaReader, AttributeReader>(
            object.kind());
    if (reader != nullptr && !object.is_root()) metadata = reader->Read(inode, sidecars);
    if (sidecars.problem) metadata.problems.push_back(*sidecars.problem);
    Noting(&metadata, [&] { ReadMarks(object, inode, &metadata); });
    return metadata;
}

Metadata ReadMetadata(const Object& object, const Sidecars& sidecars) {
    return ReadMetadata(object, *Inode::Open(object.place), sidecars);
}

Metadata ReadMetadata(const Object& object, Sidecars::Services services) {
    return ReadMetadata(object, Sidecars::Find(object, services));
}

Metadata ReadAppleDoubleFile(std::shared_ptr<const File> file) {
    Metadata metadata;
    if (!ReadLayout(*file).IsAppleDouble()) {
        throw Failure(kFailed, file->path(), "no AppleDouble file", kLook);
    }
    FileReader(std::move(file), &metadata).Read();
    if (!metadata.problems.empty()) throw Failure(metadata.problems.front());
    return metadata;
}

}  // namespace mavoea::tool

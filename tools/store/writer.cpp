#include "tools/store/writer.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "tools/place/dry_run.h"
#include "tools/store/by_kind.h"
#include "tools/store/encoding.h"
#include "tools/store/fitting.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/foreign/writer.h"
#include "tools/store/locking.h"
#include "tools/store/marks.h"
#include "tools/store/record.h"
#include "tools/store/rights.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;

constexpr const char* kMoveAway = "see what it is, and move it away";

// ---- Files --------------------------------------------------------------------------------------

// What another process is changing is left to it.
void RequireFree(const Place& target) {
    if (!target.directory->MayHave(target.name)) return;
    const auto info = target.Status();
    if (!info) return;
    if (S_ISLNK(info->st_mode)) return;  // goes by the new file's name
    if (!S_ISREG(info->st_mode)) {
        throw Failure(kFailed, target.path(), "something is in the way of metadata", kMoveAway);
    }
    const auto file = target.directory->FindFile(target.name, O_RDWR);
    if (file) LockFile(*file, Access::kWrite);
}

// The files of an object, which get their names when all of them are whole.
class NewFiles {
 public:
    // `object` outlives it.
    NewFiles(const Inode& object, const WriteOptions& options)
        : object_(object), mode_(options.mode), durability_(options.durability) {}

    // `holder`: the file that all of it was read from, which is left alone if it is this one.
    void Add(const DirectoryRef& directory, const std::string& name, const Pieces& pieces,
             const std::string& holder = {}) {
        const Place target = {directory, name};
        if (target.path() == holder) {
            files_.push_back({target, nullptr});
            return;
        }
        RequireFree(target);
        auto temporary = std::make_unique<TemporaryFile>(target);
        const File& file = temporary->file();
        Fill(file, pieces);
        if (!rights_) rights_ = mode_ ? Rights::Of(object_, *mode_) : Rights::Of(object_);
        rights_->Give(file);
        if (durability_ == Durability::kNow) file.Sync();
        files_.push_back({target, std::move(temporary)});
    }

    void GiveNames() {
        for (const New& file : files_) {
            if (file.temporary) file.temporary->GiveToTarget();
        }
        if (durability_ == Durability::kLater) return;
        for (const New& file : files_) file.target.directory->Sync();
    }

    bool Has(const Found& found) const {
        return std::any_of(files_.begin(), files_.end(), [&](const New& file) {
            return file.target.name == found.name &&
                   SameFile(file.target.directory->Status(), found.directory->Status());
        });
    }

    // The last one that was added, as it was read back.
    Found Last() const {
        const New& file = files_.back();
        if (!file.temporary) {
            return {file.target.directory, file.target.name, StatusOf(file.target)};
        }
        const WholeFile& whole = file.temporary->shared_file();
        return {file.target.directory, file.target.name, whole->Status(), whole};
    }

 private:
    struct New {
        Place target;
        std::unique_ptr<TemporaryFile> temporary;  // null: it is there already
    };

    // What is small is put together in memory, and written and read back at once.
    static void Fill(const File& file, const Pieces& pieces) {
        std::uint64_t size = 0;
        for (const Content& piece : pieces) size += piece.size();
        if (size > kSmallFile) {
            std::uint64_t end = 0;
            for (const Content& piece : pieces) end = WriteTo(file, end, piece);
            return Compare(file, pieces);
        }
        Bytes bytes;
        bytes.reserve(static_cast<std::size_t>(size));
        for (const Content& piece : pieces) {
            const Bytes part = piece.All();
            bytes.insert(bytes.end(), part.begin(), part.end());
        }
        file.Write(0, bytes);
        if (!file.KeepContents(size) || file.Read(0, size) != bytes) throw Differs(file);
    }

    static void Compare(const File& written, const Pieces& pieces) {
        std::uint64_t at = 0;
        const auto file = std::shared_ptr<const File>(&written, [](const File*) {});
        for (const Content& piece : pieces) {
            if (FirstDifference(piece, Content(file, at, piece.size()))) throw Differs(written);
            at += piece.size();
        }
    }

    static Failure Differs(const File& written) {
        return {kFailed, written.path(), "what was written is not what is read back",
                "check the disk"};
    }

    const Inode& object_;
    std::optional<mode_t> mode_;
    std::optional<Rights> rights_;
    Durability durability_;
    std::vector<New> files_;
};

bool Contains(const std::vector<std::string>& paths, const std::string& path) {
    return std::find(paths.begin(), paths.end(), path) != paths.end();
}

void WriteMarks(const Object& to, const Inode& inode, const Metadata& metadata, bool is_new) {
    if (!inode.HoldsContents()) return;
    const Dialect* const dialect = to.dialect();
    if (dialect == nullptr || dialect->marks == Dialect::Marks::kHost) {
        if (!LocksByMode(to) && (metadata.locked || !is_new)) SetLockFlag(inode, metadata.locked);
        if (metadata.hidden) SetHidden(inode, true);
        SetArchived(inode);
    }
    try {
        // Behind all that sets the archive mark: what travels with a time of creation says itself
        // whether it has that.
        const bool by_dos = dialect != nullptr && dialect->marks == Dialect::Marks::kDosAttributes;
        WriteDosAttributes(inode, by_dos ? Into::kAny : Into::kNeeded, metadata);
    } catch (const Failure&) {
        // What is not there is found, and named, by who reads it back.
    }
}

// ---- What other services keep -------------------------------------------------------------------

DirectoryRef NeedFolder(const Directory& in, const std::string& name) {
    if (DirectoryRef found = in.FindIn(name)) return found;
    const ErrorMark mark;
    if (MAVOEAMKDir(0, in.ProcPath(name).c_str()) != 0) {
        throw LibraryFailure(in.PathOf(name), mark.Get());
    }
    return in.OpenIn(name);
}

// Where the file of that path below the directory is to be, in folders that are there.
Place NeedFolders(DirectoryRef in, std::string path) {
    for (std::size_t slash; (slash = path.find('/')) != std::string::npos;) {
        in = NeedFolder(*in, path.substr(0, slash));
        path.erase(0, slash + 1);
    }
    return {in, path};
}

// Whether it is there, in folders that need not be there.
bool HasBelow(DirectoryRef in, std::string path) {
    for (std::size_t slash; in && (slash = path.find('/')) != std::string::npos;) {
        in = in->FindIn(path.substr(0, slash));
        path.erase(0, slash + 1);
    }
    return in && in->Has(path);
}

// Into the EA directory of `to`; volumes of every kind can have one.
void AddServices(const Object& to, const Metadata& metadata, NewFiles* files, Written* written) {
    for (const Metadata::ServiceFile& service : metadata.services) {
        try {
            const Directory& beside = *to.place.directory;
            if (service.name == "._") {
                files->Add(to.place.directory, AppleDoubleName(to.place.name), {service.value},
                           service.holder);
            } else if (service.name.front() == '@') {
                const std::string name = NameInEaDirectory(to.place.name) + service.name;
                files->Add(NeedEaDirectory(beside), name, {service.value}, service.holder);
            } else {
                const Place place =
                    NeedFolders(NeedEaDirectory(beside), to.place.name + service.name);
                files->Add(place.directory, place.name, {service.value}, service.holder);
            }
            written->whole.insert(service.holder);
        } catch (const Failure& failure) {
            written->missing.push_back(
                {NameOfAttribute(service.name) + " of another service", failure.cause()});
        }
    }
}

// A file of that name that is no AppleDouble file is somebody's own.
void RequireAppleDoublePlace(const Object& to, const std::string& name) {
    if (!to.place.directory->MayHave(name)) return;
    const auto info = to.place.directory->StatusOf(name);
    if (!info || (S_ISREG(info->st_mode) && info->st_size == 0)) return;
    if (IsAppleDouble(*to.place.directory, name)) return;
    throw Failure(kFailed, to.place.directory->PathOf(name),
                  "it is in the way of metadata, and is none", kMoveAway);
}

void RemoveOld(const Object& to, const Sidecars& old, const NewFiles& files) {
    if (!old.Any()) return;
    std::vector<Found> left;
    for (const Found& found : old.Files()) {
        if (!files.Has(found)) left.push_back(found);
    }
    RemoveFiles(left);
    RemoveEmptyDirectories(to, old);
}

// Everything but what services keep.
void MissAll(Metadata* metadata, const std::string& reason, std::vector<Missing>* missing) {
    for (const Missing& one : ItemsOf(*metadata, reason)) missing->push_back(one);
    Metadata left;
    left.services = std::move(metadata->services);
    left.locked = metadata->locked;
    left.hidden = metadata->hidden;
    *metadata = std::move(left);
}

void FitServices(Metadata* metadata, const Object& to, std::vector<Missing>* missing) {
    std::erase_if(metadata->services, [&](const Metadata::ServiceFile& service) {
        const bool apple_double = service.name == "._";
        const char* why = nullptr;
        if (apple_double && to.keeping() == Keeping::kAppleDouble) {
            why = "its place is that of what the object has besides";
        } else if (apple_double && to.keeping() == Keeping::kXattr) {
            why = "volumes of the destination's type keep no such file";
        } else if (NameInEaDirectory(to.place.name).size() + service.name.size() > 255 ||
                   (apple_double && AppleDoubleName(to.place.name).empty())) {
            why = "its name would be too long";
        }
        if (why == nullptr) return false;
        missing->push_back({apple_double ? "AppleDouble file " + Printable(service.holder)
                                         : NameOfAttribute(service.name) + " of another service",
                            why});
        return true;
    });
}

// ---- Volumes that keep one "._" file ------------------------------------------------------------

class AppleDoubleWriter final : public Writer {
 public:
    Metadata Fit(Metadata metadata, const Object& to,
                 std::vector<Missing>* missing) const override {
        FitServices(&metadata, to, missing);
        if (AppleDoubleName(to.place.name).empty()) {
            MissAll(&metadata, "its name is too long for a \"._\" file", missing);
            return metadata;
        }
        FitAppleDouble(&metadata, missing);
        return metadata;
    }

 protected:
    std::vector<Part> PartsOf(const Metadata& fitting) const override {
        return {
            {&Sidecars::apple_double, "", EncodeAppleDouble(fitting), fitting.whole_apple_double}};
    }
};

// ---- Volumes that keep an EA directory ----------------------------------------------------------

class EaDirectoryWriter : public Writer {
 public:
    Metadata Fit(Metadata metadata, const Object& to,
                 std::vector<Missing>* missing) const override {
        FitServices(&metadata, to, missing);
        FitRecord(&metadata);
        FitResource(&metadata);
        DropDamaged(&metadata);
        if (!metadata.whole_stream) FitStream(&metadata, missing);
        if (!metadata.whole_resource) FitHead(&metadata, missing);
        return metadata;
    }

 protected:
    std::vector<Part> PartsOf(const Metadata& fitting) const override {
        return {
            {&Sidecars::stream, "@" MAVOEA_KIND_STREAM, StreamOf(fitting), fitting.whole_stream},
            {&Sidecars::resource, "@" MAVOEA_KIND_RESOURCE, ResourceOf(fitting),
             fitting.whole_resource}};
    }

    virtual void FitRecord(Metadata* metadata) const { metadata->whole_record.reset(); }
    virtual void FitHead(Metadata* metadata, std::vector<Missing>* missing) const {
        FitEntries(metadata, RoomInHead, "a resource file", missing);
    }
    // Whether an entry goes into the resource file.
    virtual bool GoesIntoHead(const Metadata&) const { return true; }

    static bool IsHeldBy(const WholeFile& whole, const std::string& holder) {
        return whole && whole->path() == holder;
    }

 private:
    // The resource file of the source goes as it is when nothing that it should hold is elsewhere;
    // a record goes as it is itself.
    static void FitResource(Metadata* metadata) {
        const auto fits = [&](const Metadata::Item& item) {
            return IsHeldBy(metadata->whole_resource, item.holder) ||
                   IsHeldBy(metadata->whole_stream, item.holder) ||
                   (metadata->whole_record && !Contains(metadata->earlier, item.holder));
        };
        const bool all = (!metadata->finder_info || fits(*metadata->finder_info)) &&
                         (!metadata->fork || fits(*metadata->fork)) &&
                         std::all_of(metadata->entries.begin(), metadata->entries.end(),
                                     [&](const auto& entry) { return fits(entry.second); });
        if (!all) metadata->whole_resource.reset();
    }

    static Pieces StreamOf(const Metadata& metadata) {
        if (const WholeFile& whole = metadata.whole_stream) {
            return {Content(whole, 0, whole->Size())};
        }
        Metadata attributes;
        for (const Metadata::Attribute& attribute : metadata.attributes) {
            if (IsHeldBy(metadata.whole_resource, attribute.holder)) continue;
            attributes.attributes.push_back(attribute);
        }
        return attributes.attributes.empty() ? Pieces() : EncodeStream(attributes);
    }

    Pieces ResourceOf(const Metadata& metadata) const {
        if (const WholeFile& whole = metadata.whole_resource) {
            return {Content(whole, 0, whole->Size())};
        }
        Metadata head = metadata;
        const auto in_stream = [&](const std::optional<Metadata::Item>& item) {
            return item && IsHeldBy(metadata.whole_stream, item->holder);
        };
        if (in_stream(head.finder_info)) head.finder_info.reset();
        if (in_stream(head.fork)) head.fork.reset();
        std::erase_if(head.entries, [&](const auto& entry) { return in_stream(entry.second); });
        if (!head.entries.empty() && GoesIntoHead(head)) return EncodeWithHead(head);
        if (head.finder_info || head.fork) return EncodePlain(head);
        return {};
    }
};

// ---- Volumes that keep a record with the object as well -----------------------------------------

class FileEaWriter final : public EaDirectoryWriter {
 protected:
    // The record goes as it is, unless an earlier layout has something for it.
    void FitRecord(Metadata* metadata) const override {
        const auto is_earlier = [&](const Metadata::Item& item) {
            return Contains(metadata->earlier, item.holder);
        };
        const bool any =
            std::any_of(metadata->entries.begin(), metadata->entries.end(), [&](const auto& entry) {
                return RoomInRecord(entry.first) > 0 && is_earlier(entry.second);
            });
        const bool finder_info = metadata->finder_info && is_earlier(*metadata->finder_info);
        if (any || finder_info) metadata->whole_record.reset();
    }

    void FitHead(Metadata* metadata, std::vector<Missing>* missing) const override {
        FitEntries(
            metadata, [](EntryId id) { return std::max(RoomInHead(id), RoomInRecord(id)); },
            "neither a record nor a resource file", missing);
    }

    // The record has the usual ones.
    bool GoesIntoHead(const Metadata& metadata) const override {
        return std::any_of(metadata.entries.begin(), metadata.entries.end(), [](const auto& entry) {
            return RoomInRecord(entry.first) < entry.second.value.size();
        });
    }

    void WriteToObject(const Inode& inode, const Metadata& metadata,
                       Written* written) const override {
        if (!inode.HoldsContents()) return;
        Metadata record;
        record.finder_info = metadata.finder_info;
        for (const auto& [id, item] : metadata.entries) {
            if (item.value.size() <= RoomInRecord(id)) record.entries[id] = item;
        }
        try {
            if (metadata.whole_record) {
                inode.SetAttribute(kNetatalkAttribute, *metadata.whole_record);
            } else if (record.finder_info || !record.entries.empty()) {
                inode.SetAttribute(kNetatalkAttribute, EncodeRecordBlock(record));
            } else {
                (void)inode.RemoveAttribute(kNetatalkAttribute);
            }
            StampFlushTime(inode);
        } catch (const Failure& failure) {
            // The resource file has the Finder info, but clients look here.
            if (metadata.HasAny()) written->missing.push_back({"netatalk record", failure.cause()});
        }
    }
};

// ---- Volumes that keep extended attributes ------------------------------------------------------

class AttributeWriter final : public Writer {
 public:
    Metadata Fit(Metadata metadata, const Object& to,
                 std::vector<Missing>* missing) const override {
        FitServices(&metadata, to, missing);
        DropDamaged(&metadata);
        for (Metadata::Attribute& attribute : metadata.attributes) {
            if (attribute.flags == 0) continue;
            missing->push_back({"flags of " + NameOfAttribute(attribute.name),
                                "a volume of extended attributes has no place for them"});
            attribute.flags = 0;
        }
        FitEntries(
            &metadata, [](EntryId) { return std::uint32_t{0}; }, "a volume of extended attributes",
            missing);
        return metadata;
    }

 protected:
    std::vector<Part> PartsOf(const Metadata&) const override { return {}; }

    void WriteToObject(const Inode& inode, const Metadata& fitting,
                       Written* written) const override {
        for (const Metadata::Attribute& attribute : fitting.attributes) {
            Set(inode, NameOfAttribute(attribute.name), attribute.name, attribute.value, written);
        }
        if (fitting.finder_info) {
            Set(inode, "Finder info", std::string(kFinderInfoName), fitting.finder_info->value,
                written);
        }
        if (fitting.fork) WriteFork(inode, fitting.fork->value, written);
    }

 private:
    static void Set(const Inode& inode, const std::string& item, const std::string& name,
                    const Content& value, Written* written) {
        constexpr std::uint64_t kMost = 65536;  // what the kernel takes
        if (value.size() > kMost) {
            written->missing.push_back({item, "it has more than the 65,536 bytes of an attribute"});
            return;
        }
        try {
            inode.SetAttribute(name, value.All());
        } catch (const SystemFailure& failure) {
            written->missing.push_back(
                {item, failure.error() == ENOTSUP
                           ? std::string("its file system takes no attribute of that name")
                           : failure.cause()});
        }
    }

    static void WriteFork(const Inode& inode, const Content& fork, Written* written) {
        if (inode.foreseen()) return MissFork(ENOENT, written);
        const std::string path = inode.ProcPath() + "/rsrc";
        const mode_t mode = inode.Status().st_mode & kPermissionBits;
        // The execute bit is what makes it reachable.
        const bool widen = (mode & S_IXUSR) == 0;
        constexpr int kUsual = O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
        const int flags = kUsual | (DryRun() ? O_PATH : O_RDWR | O_TRUNC);
        int fd = ::open(path.c_str(), flags);
        if (fd < 0 && errno == EACCES && widen) {
            inode.SetMode(mode | S_IXUSR);
            fd = ::open(path.c_str(), flags);
            const int error = errno;
            inode.SetMode(mode);
            errno = error;
        }
        if (fd < 0) return MissFork(errno, written);
        const File file(fd, inode.path());
        if (DryRun()) return;
        (void)WriteTo(file, 0, fork);
        file.Sync();
    }

    static void MissFork(int error, Written* written) {
        const bool none = error == ENOTDIR || error == ENOENT;
        written->missing.push_back({"resource fork", none ? "its file system offers none for it"
                                                          : SystemFailure::Words(error)});
    }
};

const Writer* FindWriter(const Object& object) {
    return OneFor<Writer, AppleDoubleWriter, EaDirectoryWriter, FileEaWriter, AttributeWriter>(
        object.kind());
}

}  // namespace

const Writer& WriterFor(const Object& object) {
    RequireParent(object);
    if (const Dialect* const dialect = object.dialect()) return ForeignWriterFor(*dialect);
    if (const Writer* const writer = FindWriter(object)) return *writer;
    throw NoStore(object);
}

void RequireUnlocked(const Sidecars& sidecars) {
    for (const auto* one : {&sidecars.stream, &sidecars.resource, &sidecars.apple_double}) {
        if (!*one || !(*one)->regular()) continue;
        const auto file = (*one)->directory->FindFile((*one)->name, O_RDWR);
        if (file) LockFile(*file, Access::kWrite);
    }
}

namespace {

// What its files hold is not written over before all of it is on disk elsewhere.
void RequireWritten(const Object& to, const Inode& inode, const Written& written) {
    if (!written.missing.empty()) {
        throw Failure(kFailed, to.path(),
                      "not all of it could be written: " + Joined(written.missing),
                      "what lies beside it is as it was");
    }
    if (inode.HoldsContents()) inode.Sync();
}

}  // namespace

Written Writer::Write(const Object& to, const Inode& inode, const Metadata& fitting,
                      const WriteOptions& options) const {
    Written written;
    const Sidecars old = Sidecars::Find(to, Sidecars::Services::kFind);
    std::vector<Part> parts = PartsOf(fitting);
    if (options.first == First::kResource) std::reverse(parts.begin(), parts.end());
    std::erase_if(parts, [](const Part& part) { return part.pieces.empty(); });
    if (!parts.empty() || !fitting.services.empty()) {
        RequireOwnNames(to);
    } else {
        RequireOwnNames(to, old);
    }
    if (DryRun()) return Foresee(to, inode, fitting, old, parts);
    NewFiles files(inode, options);
    AddServices(to, fitting, &files, &written);
    Sidecars beside;
    for (const Part& part : parts) {
        if (part.kind.empty()) {
            const std::string name = AppleDoubleName(to.place.name);
            RequireAppleDoublePlace(to, name);
            files.Add(to.place.directory, name, part.pieces, HolderOf(part.whole));
        } else {
            if (!beside.ea_dir) beside.ea_dir = NeedEaDirectory(*to.place.directory);
            files.Add(beside.ea_dir, NameInEaDirectory(to.place.name) + part.kind, part.pieces,
                      HolderOf(part.whole));
        }
        beside.*part.place = files.Last();
        if (part.whole) written.whole.insert(part.whole->path());
    }
    if (WritesObjectFirst()) {
        WriteToObject(inode, fitting, &written);
        if (options.durability == Durability::kNow) RequireWritten(to, inode, written);
    }
    files.GiveNames();
    if (options.old == Old::kRemoved) RemoveOld(to, old, files);
    if (!WritesObjectFirst()) WriteToObject(inode, fitting, &written);
    WriteMarks(to, inode, fitting, options.is_new);
    // What else there is, is looked for by name.
    const bool alone = fitting.services.empty() && !old.problem && !old.Any();
    written.beside = alone ? std::move(beside) : Sidecars::Find(to, Sidecars::Services::kFind);
    return written;
}

Written Writer::Foresee(const Object& to, const Inode& inode, const Metadata& fitting,
                        const Sidecars& old, const std::vector<Part>& parts) const {
    RequireUnlocked(old);
    Written written;
    for (const Metadata::ServiceFile& service : fitting.services) {
        written.whole.insert(service.holder);
    }
    for (const Part& part : parts) {
        if (part.kind.empty()) {
            const std::string name = AppleDoubleName(to.place.name);
            RequireAppleDoublePlace(to, name);
            if (const int error = WhyNoNewFile(*to.place.directory)) {
                throw SystemFailure(to.place.directory->PathOf(name), error);
            }
            const Place place = {to.place.directory, name};
            if (!place.Status()) Foreseen::ComeAppleDouble(place);
        } else if (const DirectoryRef ea_dir = NeedEaDirectory(*to.place.directory)) {
            const std::string name = NameInEaDirectory(to.place.name) + part.kind;
            if (const int error = WhyNoNewFile(*ea_dir)) {
                throw SystemFailure(ea_dir->PathOf(name), error);
            }
            RequireFree({ea_dir, name});
        }
        if (part.whole) written.whole.insert(part.whole->path());
    }
    WriteToObject(inode, fitting, &written);
    return written;
}

std::vector<Missing> Writer::WithoutRoom(const Inode& foreseen, const Metadata& fitting) const {
    Written written;
    WriteToObject(foreseen, fitting, &written);
    return std::move(written.missing);
}

void RequirePlace(const Object& to) {
    const bool beside = to.keeping() == Keeping::kAppleDouble && to.dialect() == nullptr;
    if (!beside || !AppleDoubleName(to.place.name).empty()) return;
    throw Failure(kFailed, to.path(), "its name or path is too long to have metadata there",
                  "use a shorter name");
}

bool CopyLeftOver(const LeftOver& file, const DirectoryRef& directory) {
    const std::string first = file.path.substr(0, file.path.find('/'));
    if (BelongsToAnObject(*directory, first)) return false;
    if (DryRun()) return !HasBelow(directory->FindAgain(kEaDirName), file.path);
    const Place to = NeedFolders(NeedEaDirectory(*directory), file.path);
    const auto source = file.found.directory->FindFile(file.found.name, O_RDONLY);
    if (!source || to.directory->Has(to.name)) return false;
    const auto inode = Inode::Of(source);
    NewFiles files(*inode, {.durability = Durability::kLater});
    files.Add(to.directory, to.name, {Content(source, 0, source->Size())});
    files.GiveNames();
    return true;
}

void RemoveFiles(const std::vector<Sidecars::Found>& files) {
    std::optional<Failure> failure;
    for (const Sidecars::Found& file : files) {
        try {
            const auto now = file.directory->StatusOf(file.name);
            // Something else has come there since.
            if (!now || !SameFile(*now, file.info)) continue;
            if (S_ISDIR(now->st_mode)) {
                (void)file.directory->RemoveEmpty(file.name);
            } else {
                (void)file.directory->RemoveFile(file.name);
            }
        } catch (const Failure& problem) {
            if (!failure) failure = problem;
        }
    }
    if (failure) throw Failure(*failure);
}

void RemoveEmptyDirectories(const Object& object, const Sidecars& sidecars) {
    if (sidecars.folder) (void)sidecars.ea_dir->RemoveEmpty(object.place.name);
    if (sidecars.ea_dir) RemoveEaDirectoryIfEmpty(*object.place.directory);
}

void RemoveSidecars(const Object& object, const Sidecars& sidecars) {
    if (!sidecars.Any()) return;
    RemoveFiles(sidecars.Files());
    RemoveEmptyDirectories(object, sidecars);
}

}  // namespace mavoea::tool

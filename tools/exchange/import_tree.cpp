#include "tools/exchange/import_tree.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <map>
#include <memory>
#include <optional>
#include <set>

#include "include/mavoea.h"
#include "tools/exchange/taking_over.h"
#include "tools/place/directory.h"
#include "tools/place/dry_run.h"
#include "tools/place/volume.h"
#include "tools/say/text.h"
#include "tools/store/adoption.h"
#include "tools/store/combination.h"
#include "tools/store/encoding.h"
#include "tools/store/foreign/apple_double.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/reader.h"
#include "tools/store/rewriting.h"
#include "tools/store/rights.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"
#include "tools/walk/tree.h"
#include "tools/walk/tree_report.h"

namespace mavoea::tool {
namespace {

// The folder of an archive in which the "._" files of all that is beside it are.
constexpr const char* kArchiveFolder = "__MACOSX";

constexpr std::string_view kPrefix = "._";

constexpr const char* kByItself = "import it by itself: mavoea import FILE PATH";

// How many files wait for one syncfs, and how many directories are kept open for that.
constexpr std::size_t kMostWaiting = 4096;
constexpr std::size_t kMostOpen = 256;

Failure HasChanged(const std::string& path) {
    return {kFailed, path, "it has changed since it was read, and stays", "give the command again"};
}

// ---- A "._" file --------------------------------------------------------------------------------

struct MacSource {
    DirectoryRef directory;
    std::string name;
    struct stat info;  // before it was read
    std::shared_ptr<const File> file;
    Metadata metadata;  // what of it an object can be given

    std::string path() const { return directory->PathOf(name); }
};

// Whether what has the name is the file that was read, as it was.
bool IsUnchanged(const struct stat& now, const struct stat& read) {
    const auto same_time = [](const timespec& one, const timespec& other) {
        return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
    };
    return SameFile(now, read) && now.st_size == read.st_size &&
           same_time(now.st_mtim, read.st_mtim) && same_time(now.st_ctim, read.st_ctim);
}

void RequireUnchanged(const MacSource& source) {
    const auto now = source.directory->StatusOf(source.name);
    if (!now || !IsUnchanged(*now, source.info)) throw HasChanged(source.path());
}

MacSource ReadSource(const Place& place) {
    auto file = place.directory->FindFile(place.name, O_RDONLY);
    if (!file) throw SystemFailure(place.path(), ENOENT);
    const struct stat info = file->Status();
    // Whoever can give it a second name could have another file read.
    if (info.st_nlink > 1) {
        throw Failure(kFailed, place.path(), "it has several names",
                      "make it a file of its own: copy it, and put the copy in its place");
    }
    Metadata metadata = ReadAppleDoubleFile(file);
    SortOut(&metadata);
    return {place.directory, place.name, info, std::move(file), std::move(metadata)};
}

void Remove(const MacSource& source) {
    RequireUnchanged(source);
    (void)source.directory->RemoveFile(source.name);
}

// ---- What waits until everything is on disk -----------------------------------------------------

class Waiting {
 public:
    explicit Waiting(TreeReport* report) : report_(*report) {}

    // `object` has what all of `sources` hold. They go in this order: what is left, should the run
    // be killed, is what counts.
    void Add(const Place& object, const struct stat& info, std::vector<MacSource> sources) {
        // Another volume may be mounted on the object, and some of what it has is beside it.
        const dev_t around = object.directory->Status().st_dev;
        volumes_.try_emplace(around, object.directory);
        if (!volumes_.contains(info.st_dev)) volumes_.emplace(info.st_dev, object.Open());
        count_ += sources.size();
        for (MacSource& source : sources) {
            source.file.reset();
            source.metadata = {};
            open_.insert(source.directory.get());
        }
        objects_.push_back(std::move(sources));
    }

    // A folder that goes with what is in it.
    void AddFolder(const Place& folder) {
        open_.insert(folder.directory.get());
        folders_.push_back(folder);
    }

    void FlushIfMany() {
        if (count_ >= kMostWaiting || open_.size() + volumes_.size() >= kMostOpen) Flush();
    }

    void Flush() {
        if (Sync()) {
            for (const std::vector<MacSource>& sources : objects_) RemoveAll(sources);
        }
        for (const Place& folder : folders_) RemoveIfEmpty(folder);
        volumes_.clear();
        objects_.clear();
        folders_.clear();
        open_.clear();
        count_ = 0;
    }

 private:
    bool Sync() {
        if (DryRun()) return true;
        try {
            for (const auto& [device, directory] : volumes_) directory->SyncVolume();
            return true;
        } catch (const Failure& failure) {
            report_.AddFailure(failure.subject(), failure);
            return false;
        }
    }

    void RemoveAll(const std::vector<MacSource>& sources) {
        for (const MacSource& source : sources) {
            try {
                Remove(source);
            } catch (const Failure& failure) {
                return report_.AddFailure(source.path(), failure);
            }
        }
    }

    // What is in it that is not empty stays, and has been named.
    void RemoveIfEmpty(const Place& folder) {
        struct Level {
            Place place;
            DirectoryRef inside;
            std::vector<Directory::Entry> entries;
            std::size_t next = 0;
        };
        std::vector<Level> levels;
        const auto enter = [&](const Place& place) {
            DirectoryRef inside = place.directory->FindIn(place.name);
            if (!inside) return;
            auto entries = inside->Entries();
            levels.push_back({place, std::move(inside), std::move(entries)});
        };
        try {
            enter(folder);
            while (!levels.empty()) {
                Level& level = levels.back();
                if (level.next == level.entries.size()) {
                    const Place place = level.place;
                    levels.pop_back();
                    (void)place.directory->RemoveEmpty(place.name);
                    continue;
                }
                const Directory::Entry& entry = level.entries[level.next++];
                if (S_ISDIR(entry.type)) enter({level.inside, entry.name});
            }
        } catch (const Failure& failure) {
            report_.AddFailure(folder.path(), failure);
        }
    }

    TreeReport& report_;
    std::map<dev_t, DirectoryRef> volumes_;
    std::vector<std::vector<MacSource>> objects_;
    std::vector<Place> folders_;
    std::set<const Directory*> open_;
    std::size_t count_ = 0;
};

std::string JoinedNames(const std::vector<std::string>& names) {
    std::string text;
    for (const std::string& name : names) text += (text.empty() ? "" : ", ") + name;
    return text;
}

// ---- Onto one object ----------------------------------------------------------------------------

// Whether "._" files are where volumes of its type keep something.
bool KeepsAppleDoubles(const Object& object) { return object.keeping() == Keeping::kAppleDouble; }

// Whether what is in the file beside an object is where it belongs.
bool IsInPlace(const Object& object, const MacSource& beside) {
    if (!KeepsAppleDoubles(object)) return false;
    if (object.dialect() == nullptr) return true;
    const Metadata& metadata = beside.metadata;
    return !IsMacs(*beside.file) && metadata.attributes.empty() && !metadata.finder_info &&
           metadata.entries.empty() && metadata.strays.empty();
}

class OntoObject {
 public:
    // Files for one object, the one that counts most last; the last one lies beside it if `beside`.
    OntoObject(const Object& object, std::vector<MacSource> sources, bool beside,
               const ImportTreeOptions& options, Notes* notes)
        : object_(object),
          sources_(std::move(sources)),
          beside_(beside),
          options_(options),
          notes_(*notes) {}

    // Returns those that may go once all is on disk, in that order. Throws Failure when not all has
    // arrived: none may go then.
    std::vector<MacSource> Run() {
        RequireDeclared(object_);
        (void)WriterFor(object_);
        const bool converts = beside_ && KeepsAppleDoubles(object_);
        if (converts && options_.keep) {
            throw Failure(kFailed, sources_.back().path(),
                          std::string(object_.dialect()->program) +
                              " keeps resource forks there, so it cannot stay as it is",
                          "leave --keep out");
        }
        Metadata imported = PutTogether();
        if (converts && sources_.size() > 1) StoreTogether(imported);
        if (object_.keeping() == Keeping::kEaDirectory) {
            for (const std::string& note : Adopt(object_, AppleDoubleFiles::kKept).notes) {
                AddNote(note);
            }
        }
        if (object_.keeping() == Keeping::kXattr && object_.dialect() == nullptr) {
            SetAttributes(std::move(imported));
        } else {
            WriteAnew(imported);
        }
        return std::move(sources_);
    }

 private:
    void AddNote(const std::string& note) {
        notes_.push_back(Printable(object_.path()) + ": " + note);
    }

    // What all of the files hold.
    Metadata PutTogether() {
        Metadata all = sources_.back().metadata;
        for (std::size_t i = sources_.size() - 1; i-- > 0;) {
            const MacSource& source = sources_[i];
            std::vector<std::string> differing;
            (void)Combine(source.metadata, Wins::kThere, &all, &differing);
            all.strays.insert(all.strays.end(), source.metadata.strays.begin(),
                              source.metadata.strays.end());
            if (differing.empty()) continue;
            AddNote("what " + Printable(source.path()) + " has for it differs from what " +
                    Printable(sources_.back().path()) +
                    " has, which counts: " + JoinedNames(differing));
        }
        return all;
    }

    // Puts all of it into the file beside the object, so that the others can go before that is
    // converted: of what a run that was killed has left, the same counts.
    void StoreTogether(Metadata all) {
        MacSource& beside = sources_.back();
        all.ForgetFiles();
        std::vector<Missing> missing;
        FitAppleDouble(&all, &missing);
        if (!missing.empty()) {
            throw Failure(kFailed, sources_.front().path(),
                          "it and " + Printable(beside.path()) +
                              " cannot be put together: " + Joined(missing),
                          kByItself);
        }
        if (DryRun()) {
            sources_.erase(sources_.begin(), sources_.end() - 1);
            return;
        }
        const Place place = {beside.directory, beside.name};
        TemporaryFile temporary(place);
        std::uint64_t end = 0;
        for (const Content& piece : EncodeAppleDouble(all)) {
            end = WriteTo(temporary.file(), end, piece);
        }
        const auto differing = WhatIsMissing(all, ReadAppleDoubleFile(temporary.shared_file()));
        if (!differing.empty()) {
            throw Failure(kFailed, beside.path(),
                          "what was written is not what is read back: " + Joined(differing),
                          "check the disk");
        }
        Rights::Of(*Inode::Open(object_.place)).Give(temporary.file());
        temporary.file().Sync();
        RequireUnchanged(beside);
        temporary.GiveToTarget();
        beside.directory->Sync();
        MacSource together = ReadSource(place);
        for (std::size_t i = 0; i + 1 < sources_.size(); ++i) Remove(sources_[i]);
        sources_.clear();
        sources_.push_back(std::move(together));
    }

    // Values of the object's own attributes, one by one.
    void SetAttributes(Metadata imported) {
        if (options_.keep_existing) {
            Metadata there = ReadMetadata(object_, Sidecars::Services::kLeaveOut);
            std::vector<std::string> differing;
            (void)Combine(imported, Wins::kThere, &there, &differing);
            there.strays = std::move(imported.strays);
            there.locked = false;
            ImportAll(there);
            return RequireSame(differing);
        }
        ImportAll(imported);
    }

    void ImportAll(const Metadata& imported) {
        TakingOver work(object_);
        work.Run(imported);
        notes_.insert(notes_.end(), work.notes().begin(), work.notes().end());
        if (work.failures().empty()) return;
        throw Failure(kFailed, Subject(),
                      "not all of it was taken over: " + JoinedNames(work.failures()), kByItself);
    }

    // What lies beside the object is written anew, with what it holds and with these.
    void WriteAnew(const Metadata& imported) {
        Metadata wanted = ReadApart();
        RequireRewritable(object_, wanted);
        const bool had_any = wanted.HasAny();
        wanted.services.clear();
        std::vector<std::string> differing;
        const Wins wins = options_.keep_existing ? Wins::kThere : Wins::kOther;
        const bool lacks_record = LacksRecord(wanted);
        const bool changes = Combine(imported, wins, &wanted, &differing);
        const bool converts = beside_ && KeepsAppleDoubles(object_) && wanted.fork;
        // The file holds what differs, and the fork.
        if (options_.keep_existing && converts) RequireSame(differing);
        std::vector<Missing> missing;
        if (changes || converts || lacks_record) {
            const bool goes_at_once = had_any || converts;
            missing = Write(imported, wanted, goes_at_once ? Durability::kNow : Durability::kLater);
            if (converts) sources_.pop_back();
        }
        for (const Metadata::Stray& stray : imported.strays) {
            missing.push_back({stray.item, stray.reason});
        }
        if (!missing.empty()) {
            throw Failure(kFailed, Subject(), "not all of it was taken over: " + Joined(missing),
                          "see what it holds with: mavoea dump FILE");
        }
        if (options_.keep_existing) RequireSame(differing);
        for (const Metadata::Attribute& attribute : imported.attributes) {
            if (auto note = NoteOfUnseen(object_, attribute.name, attribute.value.size())) {
                notes_.push_back(*std::move(note));
            }
        }
    }

    // Whether its files have what the record beside them should have, too, as a run that was killed
    // leaves it.
    bool LacksRecord(const Metadata& there) const {
        if (object_.kind() != VolumeKind::kFileEA) return false;
        const auto lacks = [&](const Metadata::Item& item) {
            return item.holder != object_.path();
        };
        return (there.finder_info && lacks(*there.finder_info)) ||
               std::any_of(there.entries.begin(), there.entries.end(), [&](const auto& entry) {
                   return entry.second.value.size() <= RoomInRecord(entry.first) &&
                          lacks(entry.second);
               });
    }

    std::vector<Missing> Write(const Metadata& imported, Metadata wanted, Durability durability) {
        wanted.ForgetFiles();
        const Fitting fit = FitAll(object_, std::move(wanted), NamesOfItems(imported));
        for (const MacSource& source : sources_) RequireUnchanged(source);
        std::vector<Missing> missing = fit.missing;
        const auto lost =
            Rewrite(object_, fit.metadata, {.durability = durability}, [&] { return ReadApart(); });
        missing.insert(missing.end(), lost.begin(), lost.end());
        return missing;
    }

    // What the object has without the file that is imported.
    Metadata ReadApart() const {
        Sidecars sidecars = Sidecars::Find(object_, Sidecars::Services::kLeaveOut);
        const auto& found = sidecars.apple_double;
        if (beside_ && found && SameFile(found->info, sources_.back().info)) {
            sidecars.apple_double.reset();
        }
        return ReadMetadata(object_, sidecars);
    }

    void RequireSame(const std::vector<std::string>& differing) const {
        if (differing.empty()) return;
        throw Failure(kFailed, Subject(),
                      "it stays, for the object has other values: " + JoinedNames(differing),
                      "replace them without --keep-existing, or remove the file");
    }

    std::string Subject() const {
        return sources_.empty() ? object_.path() : sources_.back().path();
    }

    const Object& object_;
    std::vector<MacSource> sources_;
    const bool beside_;
    const ImportTreeOptions& options_;
    Notes& notes_;
};

// ---- The tree -----------------------------------------------------------------------------------

class TreeImport {
 public:
    explicit TreeImport(const ImportTreeOptions& options)
        : options_(options),
          report_({.doing = "importing",
                   .done = "imported",
                   .current = "where they belong",
                   .nothing = nullptr},
                  TreeReport::EachOf(options.verbose, options.json)),
          waiting_(&report_) {}

    ExitStatus Run() {
        RequireDescriptorPaths();
        for (const std::string& path : options_.directories) {
            try {
                Begin(path);
            } catch (const Failure& failure) {
                report_.AddFailure(path, failure);
            }
            while (!steps_.empty()) {
                const Step step = std::move(steps_.back());
                steps_.pop_back();
                Guard(step.directory, [&] { Do(step); });
                waiting_.FlushIfMany();
            }
        }
        waiting_.Flush();
        return report_.Finish(options_.json);
    }

 private:
    struct Step {
        enum class Kind {
            kObjects,  // a directory of objects
            kFolder,   // an archive's folder, when all that is beside it has been done
            kOrphans   // a directory of such a folder, of which there is none beside that
        };
        Kind kind;
        Place directory;
        // Those in which the "._" files of its objects may be besides, the outermost first.
        std::vector<Place> mirrors = {};
    };

    template <class Work>
    void Guard(const Place& place, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            if (!HasGone(place, failure)) report_.AddFailure(place.path(), failure);
        }
    }

    void Begin(const std::string& path) {
        const Object object = FindObject(path);
        const auto info = object.place.Status();
        if (!info || !S_ISDIR(info->st_mode)) {
            throw Failure(kFailed, path, "it is no directory",
                          "import one file with: mavoea import FILE PATH");
        }
        if (object.place.name == kArchiveFolder) {
            throw Failure(kFailed, path, "what it holds is of objects beside it",
                          "name the directory that it is in");
        }
        SettleNamed(object);
        steps_.push_back({Step::Kind::kObjects, object.place});
    }

    void Do(const Step& step) {
        switch (step.kind) {
            case Step::Kind::kObjects:
                return DoDirectory(step);
            case Step::Kind::kFolder:
                return waiting_.AddFolder(step.directory);
            case Step::Kind::kOrphans:
                return NameOrphans(step.directory);
        }
    }

    void DoDirectory(const Step& step) {
        const DirectoryRef inside = step.directory.directory->OpenIn(step.directory.name);
        (void)SettlePending(inside);
        std::vector<DirectoryRef> mirrors;
        for (const Place& mirror : step.mirrors) {
            Guard(mirror, [&] {
                if (DirectoryRef found = mirror.directory->FindIn(mirror.name)) {
                    mirrors.push_back(std::move(found));
                }
            });
        }
        std::vector<Directory::Entry> below;
        bool has_folder = false;
        for (const Directory::Entry& entry : inside->EntriesAtFirst()) {
            if (entry.name == kArchiveFolder && !S_ISREG(entry.type)) {
                has_folder = true;
            } else if (S_ISDIR(entry.type) && MAVOEAIsHiddenDirName(entry.name.c_str()) == 0) {
                below.push_back(entry);
            }
        }
        if (has_folder) {
            const Place folder = {inside, kArchiveFolder};
            Guard(folder, [&] {
                mirrors.push_back(inside->OpenIn(folder.name));
                if (!options_.keep) steps_.push_back({Step::Kind::kFolder, folder});
            });
        }
        DoObjects(inside, mirrors);
        AddBelow(inside, mirrors, below);
    }

    void DoObjects(const DirectoryRef& inside, const std::vector<DirectoryRef>& mirrors) {
        std::map<std::string, std::vector<Place>> files;  // by the object's name
        const auto add = [&](const DirectoryRef& directory) {
            for (const Directory::Entry& entry : directory->EntriesAtFirst()) {
                if (S_ISDIR(entry.type)) continue;
                const Place place = {directory, entry.name};
                if (entry.name.starts_with(kPrefix) && entry.name.size() > kPrefix.size()) {
                    files[entry.name.substr(kPrefix.size())].push_back(place);
                } else if (directory != inside) {
                    Fail(place, "it is no \"._\" file, and of no object");
                }
            }
        };
        for (const DirectoryRef& mirror : mirrors) add(mirror);
        add(inside);
        for (const auto& [name, places] : files) {
            DoObject({inside, name}, places);
            waiting_.FlushIfMany();
        }
    }

    void Fail(const Place& file, const char* cause) {
        report_.AddFailure(file.path(), Failure(kFailed, file.path(), cause,
                                                "see what it is, and move it away or remove it"));
    }

    void DoObject(const Place& place, std::vector<Place> files) {
        report_.Show(place);
        try {
            const auto info = place.Status();
            const bool metadata = place.name.starts_with(kPrefix) || place.name == kEaDirName ||
                                  IsTemporaryName(place.name);
            if (!info || metadata) {
                for (const Place& file : files) {
                    Fail(file, info ? "it belongs to what is no object, but metadata"
                                    : "its object is missing");
                }
                return;
            }
            Import(ObjectAt(place, &*info), *info, &files);
        } catch (const Failure& failure) {
            for (const Place& file : files) {
                if (!HasGone(file, failure)) Stay(file, failure);
            }
        }
    }

    // What went wrong with the object, or another file for it, is told of the file.
    void Stay(const Place& file, const Failure& failure) {
        const std::string path = file.path();
        if (failure.subject() == path) return report_.AddFailure(path, failure);
        const std::string advice =
            std::string(failure.what()).erase(0, failure.brief().size() + std::strlen("; "));
        report_.AddFailure(path, {failure.status(), path, "it stays: " + failure.brief(), advice});
    }

    // Takes those from `files` that are in their place.
    void Import(const Object& object, const struct stat& info, std::vector<Place>* files) {
        std::vector<MacSource> sources;
        bool beside = files->back().directory == object.place.directory;
        if (beside) {
            sources.push_back(ReadSource(files->back()));
            if (IsInPlace(object, sources.back())) {
                report_.Add(files->back().path(), Outcome::kCurrent);
                sources.pop_back();
                files->pop_back();
                beside = false;
            }
        }
        if (files->empty()) return;
        if (!S_ISREG(info.st_mode) && !S_ISDIR(info.st_mode)) {
            throw Failure(kFailed, object.path(), "only files and directories have metadata",
                          "move the \"._\" file away or remove it");
        }
        const std::size_t others = files->size() - (beside ? 1 : 0);
        for (std::size_t i = 0; i < others; ++i) {
            sources.insert(sources.begin() + static_cast<std::ptrdiff_t>(i),
                           ReadSource((*files)[i]));
        }
        auto done = OntoObject(object, std::move(sources), beside, options_, report_.notes()).Run();
        for (const Place& file : *files) report_.Add(file.path(), Outcome::kDone);
        if (options_.keep) done.clear();
        waiting_.Add(object.place, info, std::move(done));
    }

    void AddBelow(const DirectoryRef& inside, const std::vector<DirectoryRef>& mirrors,
                  const std::vector<Directory::Entry>& below) {
        std::map<std::string, std::vector<Place>> mirrored;
        for (const DirectoryRef& mirror : mirrors) {
            for (const Directory::Entry& entry : mirror->EntriesAtFirst()) {
                if (S_ISDIR(entry.type)) mirrored[entry.name].push_back({mirror, entry.name});
            }
        }
        for (auto entry = below.rbegin(); entry != below.rend(); ++entry) {
            Step step = {Step::Kind::kObjects, {inside, entry->name}};
            if (const auto found = mirrored.find(entry->name); found != mirrored.end()) {
                step.mirrors = std::move(found->second);
                mirrored.erase(found);
            }
            steps_.push_back(std::move(step));
        }
        for (const auto& [name, places] : mirrored) {
            for (const Place& place : places) steps_.push_back({Step::Kind::kOrphans, place});
        }
    }

    void NameOrphans(const Place& place) {
        const DirectoryRef directory = place.directory->OpenIn(place.name);
        for (const Directory::Entry& entry : directory->Entries()) {
            const Place inner = {directory, entry.name};
            if (S_ISDIR(entry.type)) {
                steps_.push_back({Step::Kind::kOrphans, inner});
            } else {
                Fail(inner, "its object is missing");
            }
        }
    }

    const ImportTreeOptions& options_;
    TreeReport report_;
    Waiting waiting_;
    std::vector<Step> steps_;
};

}  // namespace

ExitStatus ImportTree(const ImportTreeOptions& options) { return TreeImport(options).Run(); }

}  // namespace mavoea::tool

#include "tools/store/adoption.h"

#include <algorithm>
#include <set>

#include "include/mavoea.h"
#include "tools/place/dry_run.h"
#include "tools/say/text.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/marks.h"
#include "tools/store/reader.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;

// What there is to say of an object of which the lists tell that nothing earlier is beside it; none
// where they cannot, or something is amiss.
std::optional<Adoption> CurrentByLists(const Object& object) {
    const Directory& directory = *object.place.directory;
    const std::string apple_double = AppleDoubleName(object.place.name);
    if (!directory.listed() || (!apple_double.empty() && directory.MayHave(apple_double))) {
        return std::nullopt;
    }
    Adoption adoption;
    DirectoryRef ea_dir;
    try {
        ea_dir = directory.FindAgain(kEaDirName);
    } catch (const Failure&) {
        return std::nullopt;
    }
    if (!ea_dir) return adoption;
    const bool may_be_empty = ea_dir->EntriesAtFirst().size() < 2;  // which would go
    if (may_be_empty || ea_dir->MayHave(object.place.name)) return std::nullopt;
    const std::string name = NameInEaDirectory(object.place.name);
    adoption.current = ea_dir->HadAtFirst(name + "@" MAVOEA_KIND_STREAM) ||
                       ea_dir->HadAtFirst(name + "@" MAVOEA_KIND_RESOURCE);
    return adoption;
}

class ObjectAdoption {
 public:
    ObjectAdoption(const Object& object, AppleDoubleFiles files)
        : object_(object),
          keeps_apple_double_(files == AppleDoubleFiles::kKept),
          sidecars_(Sidecars::Find(object, Sidecars::Services::kLeaveOut)),
          wanted_(ReadMetadata(object, sidecars_)) {}

    Adoption Run() {
        adoption_.current = sidecars_.stream || sidecars_.resource;
        // The current files may be another object's.
        if (sidecars_.apple_double || sidecars_.legacy_resource ||
            !sidecars_.attribute_files.empty()) {
            RequireOwnNames(object_);
        }
        if (!wanted_.earlier.empty()) Convert();
        RenameReserved();
        NameWhatIsLeft();
        RemoveEmptyDirectories(object_, sidecars_);
        if (failure_) throw Failure(*failure_);
        return std::move(adoption_);
    }

 private:
    void Convert() {
        RequireDeclared(object_);
        RequireOwnNames(object_);
        // What is in the folder stays there, or goes into the stream.
        Metadata metadata = wanted_;
        metadata.services.clear();
        std::vector<Missing> missing;
        const Writer& writer = WriterFor(object_);
        const Metadata fitting = writer.Fit(metadata, object_, &missing);
        const auto inode = Inode::Open(object_.place);
        const auto durability = NothingGoes() ? Durability::kLater : Durability::kNow;
        const Written written =
            writer.Write(object_, *inode, fitting,
                         {.durability = durability, .old = Old::kKept, .first = First::kResource});
        missing.insert(missing.end(), written.missing.begin(), written.missing.end());
        const auto again =
            DryRun() ? std::vector<Missing>() : WhatIsMissing(fitting, ReadCurrent());
        missing.insert(missing.end(), again.begin(), again.end());
        if (!missing.empty()) {
            failure_ = Failure(
                kFailed, object_.path(),
                "not all that an earlier version kept could be converted: " + Joined(missing),
                "see where it lies with: mavoea list -l PATH");
        }
        const bool had_head = !sidecars_.resource && sidecars_.legacy_resource;
        const std::vector<Found> going = TakeAdopted(missing, written);
        if (had_head && !sidecars_.legacy_resource) GiveMarks(*inode, fitting);
        // Record and marks are in none of the files that have been synced.
        const bool kept_with_object =
            durability == Durability::kNow && (had_head || object_.kind() == VolumeKind::kFileEA);
        if (kept_with_object && !DryRun() && inode->HoldsContents()) inode->Sync();
        RemoveFiles(going);
    }

    // Whether no file is removed or written over.
    bool NothingGoes() const {
        return keeps_apple_double_ && !adoption_.current && wanted_.earlier.size() == 1 &&
               sidecars_.apple_double && sidecars_.apple_double->path() == wanted_.earlier.front();
    }

    // As services see it, that know nothing of earlier layouts.
    Metadata ReadCurrent() const {
        Sidecars current = Sidecars::Find(object_, Sidecars::Services::kLeaveOut);
        current.attribute_files.clear();
        current.legacy_resource.reset();
        current.apple_double.reset();
        current.services.clear();
        return ReadMetadata(object_, current);
    }

    // The files that are not needed any more.
    std::vector<Found> TakeAdopted(const std::vector<Missing>& missing, const Written& written) {
        std::vector<Found> going;
        const auto consider = [&](const Found& found, bool arrived) {
            const std::string path = found.path();
            const bool earlier = std::find(wanted_.earlier.begin(), wanted_.earlier.end(), path) !=
                                 wanted_.earlier.end();
            if (!earlier) return false;
            const bool whole =
                written.whole.contains(path) || (arrived && !HasStray(path) && !HasProblem(path));
            if (whole) {
                going.push_back(found);
                adoption_.adopted.push_back(path);
            }
            return whole;
        };
        std::erase_if(sidecars_.attribute_files, [&](const Found& file) {
            const bool arrived = std::none_of(
                missing.begin(), missing.end(),
                [&](const Missing& one) { return one.item == NameOfAttribute(file.name); });
            return consider(file, arrived);
        });
        for (auto* one : {&sidecars_.apple_double, &sidecars_.legacy_resource}) {
            if (keeps_apple_double_ && one == &sidecars_.apple_double) continue;
            if (*one && consider(**one, missing.empty())) one->reset();
        }
        return going;
    }

    bool HasStray(const std::string& path) const {
        return std::any_of(wanted_.strays.begin(), wanted_.strays.end(),
                           [&](const Metadata::Stray& stray) { return stray.holder == path; });
    }
    bool HasProblem(const std::string& path) const {
        return std::any_of(wanted_.problems.begin(), wanted_.problems.end(),
                           [&](const Failure& problem) { return problem.subject() == path; });
    }

    // What a legacy resource file says of the object itself. Nobody may write it who might not
    // before.
    void GiveMarks(const Inode& inode, const Metadata& metadata) {
        if (!inode.HoldsContents()) return;
        if (!metadata.entries.contains(EntryId::kAfpFileInfo) && !metadata.finder_info) {
            adoption_.notes.emplace_back(
                "its legacy resource file says nothing of its read-only and hidden marks");
        }
        const mode_t mode = inode.Status().st_mode & kPermissionBits;
        if ((metadata.AfpAttributes().value_or(0) & kAfpNoWrite) != 0 && (mode & kWriteBits) != 0) {
            LockMode(inode, mode);
        }
    }

    // Other reserved files get another name where they are.
    void RenameReserved() {
        for (const Found& file : sidecars_.reserved) {
            std::string name = file.name;
            name[name.rfind(':')] = '@';
            try {
                if (file.directory->Has(name)) continue;
                file.directory->Rename(file.name, *file.directory, name);
                adoption_.adopted.push_back(file.path());
            } catch (const Failure& failure) {
                if (!failure_) {
                    failure_ = Failure(
                        kFailed, object_.path(),
                        NameOfAttribute(file.name) +
                            " of its legacy folder could not be renamed: " + failure.cause(),
                        "see whether the folder can be written");
                }
            }
        }
    }

    void NameWhatIsLeft() {
        std::vector<Found> files = sidecars_.attribute_files;
        std::set<std::string> bad;
        for (const Found& file : files) {
            if (HasProblem(file.path())) bad.insert(file.name);
        }
        // What is no file, and has the name of an attribute.
        for (const Found& other : sidecars_.others) {
            if (!sidecars_.folder || other.directory != sidecars_.folder) continue;
            const bool reserved = other.name.starts_with("MAVO");
            if (reserved || other.name.find(':') != std::string::npos) continue;
            files.push_back(other);
            bad.insert(other.name);
        }
        if (files.empty()) return;
        const std::string count =
            std::to_string(files.size()) + (files.size() == 1 ? " file" : " files");
        const std::string stay = files.size() == 1 ? " stays in " : " stay in ";
        const std::string folder = Printable(sidecars_.folder->path());
        if (!bad.empty()) {
            failure_ = Failure(kFailed, object_.path(),
                               count + " of its legacy folder could not be converted, " +
                                   NameOfAttribute(*bad.begin()) +
                                   (files.size() == 1 ? "" : " and others"),
                               "see whether they can be read, and store them with: mavoea set PATH "
                               "NAME --file FILE");
        } else if (!failure_) {
            adoption_.notes.push_back(
                count + stay + folder + ": " +
                (sidecars_.stream ? "it has an EA stream already"
                                  : "its AppleDouble file was read later and has been taken"));
        }
    }

    const Object& object_;
    const bool keeps_apple_double_;
    Sidecars sidecars_;
    Metadata wanted_;
    Adoption adoption_;
    std::optional<Failure> failure_;
};

}  // namespace

Adoption Adopt(const Object& object, AppleDoubleFiles files) {
    if (const auto current = CurrentByLists(object)) return *current;
    return ObjectAdoption(object, files).Run();
}

void AdoptForChange(const Object& object, std::vector<std::string>* notes) {
    if (object.keeping() != Keeping::kEaDirectory) return;
    {
        const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kLeaveOut);
        const bool attributes =
            !sidecars.stream && (sidecars.apple_double || !sidecars.attribute_files.empty());
        if (!attributes && (sidecars.resource || !sidecars.legacy_resource)) return;
    }
    for (const std::string& path : Adopt(object).adopted) {
        notes->push_back(Printable(object.path()) + ": what an earlier version kept in " +
                         Printable(path) + " is in the current layout now");
    }
}

}  // namespace mavoea::tool

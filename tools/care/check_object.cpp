#include "tools/care/check_object.h"

#include <fcntl.h>

#include <algorithm>
#include <set>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tools/care/check_foreign.h"
#include "tools/care/kept.h"
#include "tools/say/text.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/locking.h"
#include "tools/store/marks.h"
#include "tools/store/reader.h"
#include "tools/store/rights.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;

// All that is found of one object. What has been told of a file is not told again by who reads it.
class Check {
 public:
    Check(const Object& object, FindingSink* sink)
        : object_(object), inode_(Inode::Open(object.place)), sink_(*sink) {}

    void Run(OncePerDirectory* undeclared, OncePerDirectory* ea_directory) {
        sidecars_ = Sidecars::Find(object_, Sidecars::Services::kLeaveOut);
        if (sidecars_.problem) CheckEaDirectory(ea_directory);
        if (inode_->HoldsContents()) names_ = inode_->AttributeNames();
        FindProgram(undeclared);
        for (const Place& kept : FindKept(object_)) sink_.AddKept(object_.path(), kept.path());
        CheckFiles();
        if (in_use_) return sink_.AddFailure(*in_use_);
        if (CheckAttributes(object_, program_, *inode_, names_, &sink_)) {
            told_.insert(inode_->path());
        }
        const Metadata metadata = ReadMetadata(object_, *inode_, sidecars_);
        CheckPlaces(metadata);
        CheckStrays(metadata);
        for (const Failure& problem : metadata.problems) AddProblem(problem);
        ReadValues(metadata);
    }

 private:
    void Add(FindingKind kind, const std::string& detail, const std::string& file = {}) {
        sink_.Add({kind, object_.path(), detail, file});
    }

    void AddProblem(const Failure& problem) {
        if (told_.contains(problem.subject())) return;
        if (problem.fault() == Fault::kDamage && problem.subject() == inode_->path()) {
            Add(FindingKind::kDamagedAttribute, problem.cause());
        } else {  // also damage that was none a moment ago
            sink_.AddFailure(problem);
        }
    }

    // What lies in large files has not been read yet.
    void ReadValues(const Metadata& metadata) {
        const auto read = [this](const Content& value) {
            constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;
            try {
                for (std::uint64_t at = 0; at < value.size() && !value.damaged(); at += kPiece) {
                    (void)value.Read(at, kPiece);
                }
            } catch (const Failure& failure) {
                AddProblem(failure);
            }
        };
        for (const Metadata::Attribute& attribute : metadata.attributes) read(attribute.value);
        if (metadata.finder_info) read(metadata.finder_info->value);
        if (metadata.fork) read(metadata.fork->value);
        for (const auto& [id, item] : metadata.entries) read(item.value);
    }

    // One that is a link, or closed to this process, is in the way of all objects beside it.
    void CheckEaDirectory(OncePerDirectory* once) {
        const Failure problem = *std::exchange(sidecars_.problem, {});
        const Directory& directory = *object_.place.directory;
        if (!once->IsFirst(directory)) return;
        const auto info = directory.StatusOf(kEaDirName);
        if (!info || S_ISDIR(info->st_mode)) return sink_.AddFailure(problem);
        sink_.Add({FindingKind::kNoFile, directory.PathOf(kEaDirName), problem.cause()});
    }

    // Whose the metadata is: what somebody has said, or what tells of another program.
    void FindProgram(OncePerDirectory* undeclared) {
        program_ = object_.dialect();
        if (object_.declared) return;
        auto sign = SignIn(names_);
        if (sign && undeclared->IsFirst(*object_.place.directory)) {
            Add(FindingKind::kUndeclaredMetadata,
                std::string(sign->dialect->program) + " keeps metadata in " +
                    Printable(object_.place.directory->path()) + ", by " + sign->text +
                    "; --volume PATH=" + std::string(sign->dialect->name) + " declares it");
        }
        if (!sign && sidecars_.apple_double) sign = FindSign(object_.place);
        if (sign) program_ = sign->dialect;
    }

    bool ForksAreBeside() const {
        return program_ != nullptr && program_->fork == Dialect::Fork::kAppleDouble;
    }

    // ---- Files ----------------------------------------------------------------------------------

    void CheckFiles() {
        const bool beside = object_.keeping() == Keeping::kAppleDouble || ForksAreBeside();
        CheckFile(&sidecars_.stream, FindingKind::kDamagedStream, true);
        CheckFile(&sidecars_.resource, FindingKind::kDamagedResourceFile, true);
        CheckFile(&sidecars_.legacy_resource, FindingKind::kDamagedResourceFile, false);
        CheckFile(&sidecars_.apple_double, FindingKind::kDamagedAppleDouble, beside);
        if (!sidecars_.apple_double && beside) CheckOccupied();
        if (sidecars_.resource_copy) CheckResourceCopy(&*sidecars_.resource_copy);
        for (const Found& other : sidecars_.others) {
            if (!S_ISDIR(other.info.st_mode)) AddNoFile(other);
        }
    }

    void AddNoFile(const Found& found) {
        Add(FindingKind::kNoFile, "it is no regular file", found.path());
        told_.insert(found.path());
    }

    // The open file, locked and read as far as it is small, so that whoever looks at it afterwards
    // sees the same. Null where there is nothing to be looked at.
    WholeFile OpenFile(Found* found) {
        if (!found->regular()) {
            AddNoFile(*found);
            return nullptr;
        }
        try {
            if (!found->file) found->file = found->directory->FindFile(found->name, O_RDONLY);
            if (!found->file) return nullptr;
            LockFile(*found->file, Access::kRead);
            (void)found->file->KeepContents(kSmallFile);
            return found->file;
        } catch (const Failure& failure) {
            if (failure.fault() == Fault::kInUse) {
                in_use_ = failure;
            } else {
                sink_.AddFailure(failure);
            }
            told_.insert(found->path());
            return nullptr;
        }
    }

    void CheckFile(std::optional<Found>* found, FindingKind damage, bool in_its_place) {
        if (!*found) return;
        const WholeFile file = OpenFile(&**found);
        if (!file) return;
        const Layout layout = ReadLayout(*file);
        const auto violations = CheckLayout(layout).violations;
        for (const Violation& one : violations) {
            sink_.Add(FindingOf(damage, object_.path(), file->path(), layout, one));
            told_.insert(file->path());
        }
        if (damage == FindingKind::kDamagedResourceFile && violations.empty()) {
            CheckHead(*file, layout);
        }
        if (damage == FindingKind::kDamagedAppleDouble) {
            CheckAcceptance(program_, object_.path(), *file, layout, &sink_);
        }
        if (in_its_place) CheckRights(*file);
    }

    // Entries of others than Finder info and fork make the head of a resource file a record.
    void CheckHead(const File& file, const Layout& layout) {
        const bool has_record =
            layout.file_size >= kResourceHeadSize &&
            std::any_of(layout.entries.begin(), layout.entries.end(), [](const auto& entry) {
                return entry.id != EntryId::kFinderInfo && entry.id != EntryId::kResourceFork;
            });
        if (!has_record) return;
        const Bytes block = file.Read(0, kResourceHeadSize);
        const Layout head = ReadLayout(ByteView(block));
        for (const Violation& one : CheckRecord(head, RecordPlace::kResourceFile).violations) {
            sink_.Add(
                FindingOf(FindingKind::kDamagedRecord, object_.path(), file.path(), head, one));
        }
    }

    // A file under the name of the "._" file that is none.
    void CheckOccupied() {
        const DirectoryRef& directory = object_.place.directory;
        const std::string name = AppleDoubleName(object_.place.name);
        if (name.empty() || !directory->MayHave(name)) return;
        const auto info = directory->StatusOf(name);
        if (!info || (S_ISREG(info->st_mode) && info->st_size == 0)) return;
        std::optional<Found> found = Found{directory, name, *info};
        CheckFile(&found, FindingKind::kDamagedAppleDouble, false);
    }

    // The library has one that it works with locked.
    void CheckResourceCopy(Found* found) {
        if (!OpenFile(found)) return;
        Add(FindingKind::kUnfinishedRepair, "a repair of its resource file was cut short",
            found->path());
    }

    void CheckRights(const File& file) {
        try {
            auto missing = Rights::Of(*inode_).Missing(file);
            const bool is_locked = (inode_->info().st_mode & kWriteBits) == 0;
            if (missing && is_locked) {  // A lock leaves the metadata as it was.
                missing = Rights::Of(*inode_, UnlockedMode(*inode_)).Missing(file);
            }
            if (missing) Add(FindingKind::kOtherRights, *missing, file.path());
        } catch (const Failure& failure) {
            sink_.AddFailure(failure);
        }
    }

    // ---- Places ---------------------------------------------------------------------------------

    void CheckPlaces(const Metadata& metadata) {
        if (object_.keeping() == Keeping::kEaDirectory) {
            CheckEarlier(metadata);
            CheckMisplacedAttributes(metadata);
        } else {
            CheckEaFiles();
        }
        if (object_.keeping() == Keeping::kXattr) CheckAppleDouble();
    }

    // What of earlier versions is read is to be converted; what is not has been, or never counted.
    void CheckEarlier(const Metadata& metadata) {
        const auto counts = [&](const std::string& path) {
            return std::find(metadata.earlier.begin(), metadata.earlier.end(), path) !=
                   metadata.earlier.end();
        };
        constexpr const char* kEarlier = "an earlier version has kept it there";
        constexpr const char* kStranded = "it is left over, and nobody reads it";
        std::vector<Found> folder = sidecars_.attribute_files;
        if (sidecars_.legacy_resource) folder.push_back(*sidecars_.legacy_resource);
        for (const Found& file : folder) {
            const bool earlier = counts(file.path());
            Add(earlier ? FindingKind::kEarlierLayout : FindingKind::kStrandedMetadata,
                earlier ? kEarlier : kStranded, file.path());
        }
        for (const Found& file : sidecars_.reserved) {
            Add(FindingKind::kEarlierLayout, kEarlier, file.path());
        }
        if (!sidecars_.apple_double || ForksAreBeside()) return;
        const std::string path = sidecars_.apple_double->path();
        if (counts(path)) {
            Add(FindingKind::kEarlierLayout, "a Mac, or an earlier version, has kept it there",
                path);
        } else {
            Add(FindingKind::kMisplacedMetadata, kStranded, path);
        }
    }

    void CheckMisplacedAttributes(const Metadata& metadata) {
        if (!metadata.whole_resource || !sidecars_.resource) return;
        const std::string& path = metadata.whole_resource->path();
        const auto count = std::count_if(
            metadata.attributes.begin(), metadata.attributes.end(),
            [&](const Metadata::Attribute& attribute) { return attribute.holder == path; });
        if (count == 0) return;
        Add(FindingKind::kMisplacedAttributes,
            std::to_string(count) + (count == 1 ? " attribute" : " attributes") +
                " in place of the EA stream",
            path);
    }

    // Files in an EA directory, of which volumes of the type know nothing.
    void CheckEaFiles() {
        if (!sidecars_.ea_dir) return;
        const std::string derived = NameInEaDirectory(object_.place.name);
        for (const char* kind : {"@" MAVOEA_KIND_STREAM, "@" MAVOEA_KIND_RESOURCE}) {
            const std::string name = derived + kind;
            if (!sidecars_.ea_dir->MayHave(name) || !sidecars_.ea_dir->Has(name)) continue;
            AddMisplaced(sidecars_.ea_dir->PathOf(name));
        }
        for (const Found& file : sidecars_.attribute_files) AddMisplaced(file.path());
        if (sidecars_.legacy_resource) AddMisplaced(sidecars_.legacy_resource->path());
    }

    void AddMisplaced(const std::string& file) {
        Add(FindingKind::kMisplacedMetadata,
            "volumes of type " + TypeId(object_.type) + ", " + std::string(TypeName(object_.type)) +
                ", have no such file",
            file);
    }

    // There it is an object of its own.
    void CheckAppleDouble() {
        const Directory& directory = *object_.place.directory;
        const std::string name = AppleDoubleName(object_.place.name);
        if (name.empty() || !directory.MayHave(name)) return;
        const auto info = directory.StatusOf(name);
        if (!info || !S_ISREG(info->st_mode) || !IsAppleDouble(directory, name)) return;
        AddMisplaced(directory.PathOf(name));
    }

    void CheckStrays(const Metadata& metadata) {
        for (const Metadata::Stray& stray : metadata.strays) {
            const std::string detail = stray.item + ": " + stray.reason;
            if (stray.second) {
                Add(FindingKind::kDifferingValues, detail, stray.holder);
            } else if (stray.holder == inode_->path()) {
                Add(FindingKind::kDamagedAttribute, detail);
            }
        }
    }

    const Object& object_;
    std::shared_ptr<const Inode> inode_;
    FindingSink& sink_;
    Sidecars sidecars_;
    std::vector<std::string> names_;  // of its attributes
    const Dialect* program_ = nullptr;
    std::optional<Failure> in_use_;  // by another process
    std::set<std::string> told_;     // files of which all has been told
};

}  // namespace

bool OncePerDirectory::IsFirst(const Directory& directory) {
    const struct stat now = directory.Status();
    const bool first = !last_ || !SameFile(*last_, now);
    last_ = now;
    return first;
}

void ObjectCheck::Run(const Object& object) {
    RequireParent(object);
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    Check(object, &sink_).Run(&undeclared_, &ea_directory_);
}

}  // namespace mavoea::tool

#include "tools/care/dangling.h"

#include <algorithm>
#include <optional>
#include <string_view>
#include <unordered_set>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kEaDir = kEaDirName;
constexpr std::string_view kCover = kCoverName;
constexpr std::string_view kAppleDoublePrefix = "._";
constexpr const char* kObjectGone = "its object is gone";
constexpr const char* kNoObjects = "its directory holds no objects";
constexpr const char* kCutShort = "a run of mavoea was cut short";

using Entry = Directory::Entry;
using Names = std::unordered_set<std::string>;

struct FileKind {
    std::string_view suffix;
    DanglingKind kind;
};
constexpr FileKind kFileKinds[] = {
    {"@" MAVOEA_KIND_STREAM, DanglingKind::kStream},
    {"@" MAVOEA_KIND_RESOURCE, DanglingKind::kResource},
    {"@" MAVOEA_KIND_RESOURCE "Tmp", DanglingKind::kResourceCopy},
};

// The kind of a metadata file in an EA directory; null where the name is that of none.
const FileKind* KindOf(const std::string& name) {
    const auto* const kind =
        std::find_if(std::begin(kFileKinds), std::end(kFileKinds),
                     [&](const FileKind& one) { return name.ends_with(one.suffix); });
    return kind == std::end(kFileKinds) ? nullptr : kind;
}

std::string LastComponent(const std::string& path) {
    const std::string text = path.c_str();
    return text.substr(text.rfind('/') + 1);
}

// Of the "._" file with the characters that FAT reserves replaced, as copies to volumes with such
// files name it; empty where that makes no difference.
std::string SafeAppleDouble(const std::string& object) {
    const std::string plain = '/' + std::string(kAppleDoublePrefix) + object;
    std::string safe(MAVOEA_PATH_SIZE + 1, '\0');
    if (MAVOStrReplaceFATReservedChar(plain.c_str(), safe.data(), MAVOEA_PATH_SIZE) < 0) return {};
    return safe.c_str() == plain ? std::string() : LastComponent(safe);
}

class Search {
 public:
    // Metadata that is made after it was listed is not looked at, so that its object, which came
    // before it, is listed for certain.
    Search(const DirectoryRef& directory, const DirectoryRef& ea_dir, bool others)
        : directory_(*directory),
          others_(others),
          ea_dir_(ea_dir),
          metadata_(ea_dir_ ? ea_dir_->Entries() : std::vector<Entry>()),
          entries_(directory->Entries()) {}

    std::vector<Dangling> Run() {
        for (const Entry& entry : entries_) LookAtOwn(directory_.shared_from_this(), entry);
        FindOrphans();
        if (!ea_dir_) return std::move(found_);
        for (const Entry& entry : entries_) {
            if (Goes(entry.name) || IsOwn(entry)) continue;
            owners_.insert(NameInEaDirectory(entry.name));
            if (entry.name != kEaDir) alone_ = false;
        }
        for (const Entry& entry : metadata_) Look(entry);
        if (!stays_) {
            Add(DanglingKind::kEaDirectory, std::string(kEaDir),
                alone_ ? kNoObjects : "nothing is left in it");
        }
        return std::move(found_);
    }

 private:
    static bool IsOwn(const Entry& entry) {
        if (S_ISDIR(entry.type)) return PendingOwner::Parse(entry.name).has_value();
        return IsTemporaryName(entry.name);
    }

    // What this tool has given a name of its own; what it works with just now stays.
    void LookAtOwn(const DirectoryRef& holder, const Entry& entry) {
        if (!IsOwn(entry)) return;
        if (S_ISDIR(entry.type)) {
            if (!IsLeftPending(holder, entry)) return;
            Add(DanglingKind::kPending, holder, entry.name, kCutShort);
        } else if (IsAbandoned(*holder, entry.name)) {
            Add(DanglingKind::kTemporary, holder, entry.name, kCutShort);
        }
    }

    // "._" files.
    void FindOrphans() {
        for (const Entry& entry : entries_) {
            if (!S_ISREG(entry.type) || !entry.name.starts_with(kAppleDoublePrefix)) continue;
            const std::string object = entry.name.substr(kAppleDoublePrefix.size());
            const bool has_object = !object.empty() && directory_.Has(object);
            if (!has_object && IsAppleDouble(directory_, entry.name)) orphans_.insert(entry.name);
        }
        if (orphans_.empty()) return;
        for (const Entry& entry : entries_) orphans_.erase(SafeAppleDouble(entry.name));
        for (const Entry& entry : entries_) {
            if (Goes(entry.name)) Add(DanglingKind::kAppleDouble, entry.name);
        }
    }

    bool Goes(const std::string& name) const { return orphans_.contains(name); }

    // Whether the object is there whose metadata has that name in front. The file system has the
    // last word: some take names for the same that differ in case.
    bool HasObject(const std::string& name) const {
        return owners_.contains(name) || (!Goes(name) && directory_.Has(name));
    }

    // "<name>@<kind>", where both may have an '@': any object that it could belong to keeps it.
    bool MayBelong(const std::string& name) const {
        for (std::size_t at = name.find('@'); at != std::string::npos;
             at = name.find('@', at + 1)) {
            if (HasObject(name.substr(0, at))) return true;
        }
        return false;
    }

    bool HoldsFolders(const std::string& name) const {
        const DirectoryRef folder = ea_dir_->FindIn(name);
        const std::vector<Entry> entries = folder ? folder->Entries() : std::vector<Entry>();
        return std::any_of(entries.begin(), entries.end(),
                           [](const Entry& entry) { return S_ISDIR(entry.type); });
    }

    void Look(const Entry& entry) {
        if (IsOwn(entry)) {
            const std::size_t before = found_.size();
            LookAtOwn(ea_dir_, entry);
            // What comes of a rename is there afterwards.
            if (found_.size() == before || S_ISDIR(entry.type)) stays_ = true;
            return;
        }
        if (S_ISREG(entry.type)) {
            if (entry.name == kCover) return;
            if (const FileKind* const kind = KindOf(entry.name)) {
                if (HasObject(entry.name.substr(0, entry.name.size() - kind->suffix.size()))) {
                    stays_ = true;
                } else {
                    Add(kind->kind, entry.name);
                }
                return;
            }
        }
        if (S_ISDIR(entry.type)) {
            if (HasObject(entry.name) || MayBelong(entry.name)) {
                stays_ = true;
            } else if (HoldsFolders(entry.name)) {
                AddOther(entry.name, kObjectGone);
            } else {
                Add(DanglingKind::kLegacyFolder, entry.name);
            }
            return;
        }
        if (alone_) {
            AddOther(entry.name, kNoObjects);
        } else if (entry.name.find('@') == std::string::npos || MayBelong(entry.name)) {
            stays_ = true;
        } else {
            AddOther(entry.name, kObjectGone);
        }
    }

    void Add(DanglingKind kind, const std::string& name, const char* because = kObjectGone) {
        const bool beside =
            kind == DanglingKind::kAppleDouble || kind == DanglingKind::kEaDirectory;
        Add(kind, beside ? directory_.shared_from_this() : ea_dir_, name, because);
    }
    void Add(DanglingKind kind, const DirectoryRef& holder, const std::string& name,
             const char* because) {
        if (const auto info = holder->StatusOf(name)) {
            found_.push_back({kind, holder, name, because, *info});
        }
    }

    void AddOther(const std::string& name, const char* because) {
        if (!others_) stays_ = true;
        Add(DanglingKind::kOther, name, because);
    }

    const Directory& directory_;
    bool others_;
    DirectoryRef ea_dir_;
    std::vector<Entry> metadata_;  // what is in it
    std::vector<Entry> entries_;   // what is in the directory
    Names orphans_;
    Names owners_;        // how metadata of the objects that are there begins
    bool alone_ = true;   // the EA directory, in its directory
    bool stays_ = false;  // something in the EA directory
    std::vector<Dangling> found_;
};

}  // namespace

const char* IdOf(DanglingKind kind) {
    switch (kind) {
        case DanglingKind::kTemporary:
            return "temporary";
        case DanglingKind::kPending:
            return "pending";
        case DanglingKind::kAppleDouble:
            return "appleDouble";
        case DanglingKind::kStream:
            return "stream";
        case DanglingKind::kResource:
            return "resource";
        case DanglingKind::kResourceCopy:
            return "resourceCopy";
        case DanglingKind::kLegacyFolder:
            return "legacyFolder";
        case DanglingKind::kEaDirectory:
            return "eaDirectory";
        case DanglingKind::kOther:
            break;
    }
    return "other";
}

const char* LabelOf(DanglingKind kind) {
    switch (kind) {
        case DanglingKind::kTemporary:
            return "temporary file";
        case DanglingKind::kPending:
            return "unfinished rename";
        case DanglingKind::kAppleDouble:
            return "AppleDouble file";
        case DanglingKind::kStream:
            return "EA stream";
        case DanglingKind::kResource:
            return "resource file";
        case DanglingKind::kResourceCopy:
            return "unfinished copy of a resource file";
        case DanglingKind::kLegacyFolder:
            return "legacy folder";
        case DanglingKind::kEaDirectory:
            return "EA directory";
        case DanglingKind::kOther:
            break;
    }
    return "of another service";
}

bool HasObject(const Directory& directory, const Dangling& dangling) {
    switch (dangling.kind) {
        case DanglingKind::kAppleDouble: {
            const std::string object = dangling.name.substr(kAppleDoublePrefix.size());
            return !object.empty() && directory.Has(object);
        }
        case DanglingKind::kStream:
        case DanglingKind::kResource:
        case DanglingKind::kResourceCopy: {
            const std::string start = dangling.name.substr(
                0, dangling.name.size() - KindOf(dangling.name)->suffix.size());
            const auto objects = MayBelongTo(directory, dangling.name);
            return std::any_of(objects.begin(), objects.end(), [&](const std::string& object) {
                return NameInEaDirectory(object) == start;
            });
        }
        default:
            return BelongsToAnObject(directory, dangling.name);
    }
}

std::vector<Dangling> FindDangling(const DirectoryRef& directory, const DirectoryRef& ea_dir,
                                   bool others) {
    return Search(directory, ea_dir, others).Run();
}

}  // namespace mavoea::tool

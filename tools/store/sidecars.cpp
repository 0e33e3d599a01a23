#include "tools/store/sidecars.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <functional>
#include <utility>

#include "include/mavoea.h"
#include "tools/place/dry_run.h"
#include "tools/say/messages.h"
#include "tools/store/layout.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kReserved = "MAVO";
constexpr std::string_view kStreamSuffix = "@" MAVOEA_KIND_STREAM;
constexpr std::string_view kResourceSuffix = "@" MAVOEA_KIND_RESOURCE;
constexpr std::string_view kResourceCopySuffix = "@" MAVOEA_KIND_RESOURCE "Tmp";
constexpr std::string_view kAppleDoublePrefix = "._";
constexpr std::size_t kNameMax = 255;

// The longest name that is used unchanged.
constexpr std::size_t kUnchangedMax = kNameMax - kStreamSuffix.size();

bool leaves_ea_directories = false;
bool left_ea_directory = false;

bool MayBeAppleDouble(const struct stat& info) {
    return S_ISREG(info.st_mode) && info.st_size >= static_cast<off_t>(AppleDoubleHeader::kSize);
}

bool HasColon(const std::string& name) { return name.find(':') != std::string::npos; }

// Whether the directory, when it was listed, had an object whose name is shortened to that.
bool HadShortenedAtFirst(const Directory& directory, const std::string& derived) {
    constexpr std::size_t kKept = kUnchangedMax - 7;  // but for a check and an extension
    const std::vector<std::string> names = directory.NamesAtFirst(derived.substr(0, kKept));
    return std::any_of(names.begin(), names.end(), [&](const std::string& name) {
        return name.size() > kUnchangedMax && NameInEaDirectory(name) == derived;
    });
}

// Whether the directory, when it was listed, had an object to which something of that name in the
// EA directory may belong: one whose name ends before an '@' that is at `from` or behind it.
bool HadOwnerAtFirst(const Directory& directory, const std::string& name, std::size_t from) {
    for (std::size_t at = name.find('@', from); at != std::string::npos;
         at = name.find('@', at + 1)) {
        const std::string object = name.substr(0, at);
        if (directory.HadAtFirst(object)) return true;
        if (at == kUnchangedMax && HadShortenedAtFirst(directory, object)) return true;
    }
    return false;
}

class Finder {
 public:
    explicit Finder(const Object& object)
        : directory_(*object.place.directory),
          name_(object.place.name),
          derived_(NameInEaDirectory(name_)) {}

    Sidecars Run(const Object& object, Sidecars::Services services,
                 const Sidecars::IsKnown& is_known) {
        const Keeping keeping = object.keeping();
        if (keeping == Keeping::kNone || object.is_root()) return {};
        if (keeping != Keeping::kXattr) FindAppleDouble(is_known);
        try {
            sidecars_.ea_dir = directory_.FindAgain(kEaDirName);
        } catch (const Failure& failure) {
            sidecars_.problem = failure;
        }
        if (!sidecars_.ea_dir) return std::move(sidecars_);
        if (services == Sidecars::Services::kFind || directory_.listed()) {
            (void)sidecars_.ea_dir->EntriesAtFirst();
        }
        if (keeping != Keeping::kAppleDouble) FindFiles(keeping);
        FindInFolder();
        if (services == Sidecars::Services::kFind) FindServices();
        return std::move(sidecars_);
    }

 private:
    using Found = Sidecars::Found;

    static std::optional<Found> Look(const DirectoryRef& directory, const std::string& name) {
        if (!directory->MayHave(name)) return std::nullopt;
        const auto info = directory->StatusOf(name);
        return info ? std::optional(Found{directory, name, *info}) : std::nullopt;
    }

    void FindAppleDouble(const Sidecars::IsKnown& is_known) {
        const std::string name = AppleDoubleName(name_);
        if (name.empty()) return;
        // Its access time says something, and is taken before anybody looks into it.
        auto found = Look(directory_.shared_from_this(), name);
        if (!found || !MayBeAppleDouble(found->info)) return;
        if (!is_known || !is_known(name_, found->info)) {
            found->file = tool::FindAppleDouble(directory_, name);
            if (!found->file) return;
        }
        directory_.NoteMetadata(name);
        sidecars_.apple_double = std::move(found);
    }

    void FindFiles(Keeping keeping) {
        const DirectoryRef& in = sidecars_.ea_dir;
        if (keeping == Keeping::kEaDirectory) {
            sidecars_.stream = Look(in, derived_ + std::string(kStreamSuffix));
        }
        sidecars_.resource = Look(in, derived_ + std::string(kResourceSuffix));
        const std::string copy = derived_ + std::string(kResourceCopySuffix);
        if (copy.size() <= kNameMax) sidecars_.resource_copy = Look(in, copy);
    }

    void FindInFolder() {
        const auto found = Look(sidecars_.ea_dir, name_);
        if (!found) return;
        if (S_ISLNK(found->info.st_mode)) sidecars_.others.push_back(*found);
        if (!S_ISDIR(found->info.st_mode)) return;  // perhaps a file of another object
        sidecars_.folder = sidecars_.ea_dir->OpenIn(name_);
        AddFolder(sidecars_.folder, "/");
    }

    void AddFolder(const DirectoryRef& folder, const std::string& prefix) {
        for (const Directory::Entry& entry : folder->Entries()) {
            const auto found = Look(folder, entry.name);
            if (!found) continue;
            const std::string name = prefix + entry.name;
            if (S_ISDIR(found->info.st_mode)) {
                AddFolder(folder->OpenIn(entry.name), name + '/');
                sidecars_.others.push_back(*found);
            } else if (!found->regular()) {
                sidecars_.others.push_back(*found);
            } else {
                AddFile(*found, name, prefix == "/");
            }
        }
    }

    void AddFile(const Found& found, const std::string& name, bool at_top) {
        const bool reserved = found.name.starts_with(kReserved);
        if (at_top && found.name == MAVOEA_KIND_LEGACY_RESOURCE) {
            sidecars_.legacy_resource = found;
        } else if (at_top && !reserved && !HasColon(found.name)) {
            sidecars_.attribute_files.push_back(found);
        } else {
            if (at_top && reserved && HasColon(found.name)) sidecars_.reserved.push_back(found);
            sidecars_.services.push_back({found, name});
        }
    }

    // "NAME@KIND". Both may have an '@': it belongs to the object with the longest name.
    void FindServices() {
        for (const std::string& name : sidecars_.ea_dir->NamesAtFirst(derived_ + '@')) {
            const std::string kind = name.substr(derived_.size());
            if (kind == kStreamSuffix || kind == kResourceSuffix || kind == kResourceCopySuffix) {
                continue;
            }
            if (BelongsToALongerName(name)) continue;
            const auto found = Look(sidecars_.ea_dir, name);
            if (!found) continue;
            if (found->regular()) {
                sidecars_.services.push_back({*found, kind});
            } else if (!S_ISDIR(found->info.st_mode)) {
                sidecars_.others.push_back(*found);
            }
        }
    }

    bool BelongsToALongerName(const std::string& name) const {
        if (HadOwnerAtFirst(directory_, name, derived_.size() + 1)) return true;
        // A folder of an object with an '@' in its name.
        return S_ISDIR(sidecars_.ea_dir->StatusOf(name).value_or(kNoStatus).st_mode) &&
               directory_.Has(name);
    }

    static constexpr struct stat kNoStatus {};

    const Directory& directory_;
    const std::string& name_;
    std::string derived_;
    Sidecars sidecars_;
};

}  // namespace

Sidecars Sidecars::Find(const Object& object, Services services, const IsKnown& is_known) {
    return Finder(object).Run(object, services, is_known);
}

bool Sidecars::Any() const { return folder || !Files().empty(); }

std::vector<Sidecars::Found> Sidecars::Files() const {
    std::vector<Found> files;
    for (const auto* one : {&stream, &resource, &resource_copy, &apple_double, &legacy_resource}) {
        if (*one) files.push_back(**one);
    }
    files.insert(files.end(), attribute_files.begin(), attribute_files.end());
    for (const Service& service : services) files.push_back(service.found);
    files.insert(files.end(), others.begin(), others.end());
    return files;
}

std::string NameInEaDirectory(const std::string& name) {
    if (name.size() <= kUnchangedMax) return name;
    std::string path(MAVOEA_PATH_SIZE + 1, '\0');
    // The directory makes no difference, and a short one leaves room for every name.
    if (MAVOEAPathNoADFS(EA_FORM_FILE, ('/' + name).c_str(), MAVOEA_KIND_STREAM, path.data(),
                         MAVOEA_PATH_SIZE) != 0) {
        return name;
    }
    path.resize(path.find('\0'));
    path.resize(path.size() - kStreamSuffix.size());
    return path.substr(path.rfind('/') + 1);
}

std::string AppleDoubleName(const std::string& name) {
    if (name.size() + kAppleDoublePrefix.size() > kNameMax) return {};
    return std::string(kAppleDoublePrefix) + name;
}

WholeFile FindAppleDouble(const Directory& directory, const std::string& name) {
    WholeFile file = directory.FindFile(name, O_RDONLY);
    if (!file) return nullptr;
    const Bytes head = file->Read(0, AppleDoubleHeader::kSize);
    BeReader in(head);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    const bool valid =
        in.ok() && header.magic == kAppleDoubleMagic && header.version == kAppleDoubleVersion2;
    return valid ? file : nullptr;
}

bool IsAppleDouble(const Directory& directory, const std::string& name) {
    const auto* const foreseen = Foreseen::Find(directory, name);
    if (foreseen != nullptr && foreseen->is_apple_double) return true;
    const auto info = directory.StatusOf(name);
    return info && MayBeAppleDouble(*info) && FindAppleDouble(directory, name) != nullptr;
}

namespace {

bool HasAppleDoubleName(const Directory::Entry& entry) {
    return entry.name.starts_with(kAppleDoublePrefix);
}

// How often it begins with that of a "._" file.
std::size_t Prefixes(std::string_view name) {
    std::size_t count = 0;
    for (; name.starts_with(kAppleDoublePrefix); ++count) {
        name.remove_prefix(kAppleDoublePrefix.size());
    }
    return count;
}

// Whose metadata a "._" file would be.
std::string ObjectOf(const Directory::Entry& entry) {
    return entry.name.substr(kAppleDoublePrefix.size());
}

// What its name, its type and that of the volume say.
bool MayBeMetadata(const Directory& directory, const Directory::Entry& entry, int type) {
    const Keeping keeping = KeepingOf(type);
    if (S_ISDIR(entry.type)) return entry.name == kEaDirName && keeping != Keeping::kNone;
    if (!S_ISREG(entry.type) || !HasAppleDoubleName(entry)) return false;
    if (keeping != Keeping::kAppleDouble && keeping != Keeping::kEaDirectory) return false;
    const std::string object = ObjectOf(entry);
    return !object.empty() && directory.HadAtFirst(object);
}

}  // namespace

bool IsMetadata(const Directory& directory, const Directory::Entry& entry, int type) {
    if (!MayBeMetadata(directory, entry, type)) return false;
    if (S_ISDIR(entry.type)) return true;
    return !NamesMetadata(directory, ObjectOf(entry), type) && IsAppleDouble(directory, entry.name);
}

bool NamesMetadata(const Directory& directory, const std::string& name, int type) {
    if (name != kEaDirName && !name.starts_with(kAppleDoublePrefix)) return false;
    if (directory.IsNotedAsMetadata(name)) return true;
    const auto info = directory.StatusOf(name);
    return info && IsMetadata(directory, {name, info->st_mode & S_IFMT}, type);
}

std::vector<Directory::Entry> CandidatesIn(const DirectoryRef& directory) {
    std::vector<Directory::Entry> entries = directory->EntriesAtFirst();
    const int type = ReadableType(ObjectAt({directory, kEaDirName}, nullptr).type);
    std::erase_if(entries, [&](const Directory::Entry& entry) {
        return !HasAppleDoubleName(entry) && MayBeMetadata(*directory, entry, type);
    });
    const auto named =
        std::stable_partition(entries.begin(), entries.end(), std::not_fn(HasAppleDoubleName));
    // "._x" may be an object, and "._._x" its metadata.
    std::stable_sort(named, entries.end(), [](const auto& one, const auto& other) {
        return Prefixes(one.name) < Prefixes(other.name);
    });
    return entries;
}

bool IsObject(const DirectoryRef& directory, const Directory::Entry& candidate) {
    if (!S_ISREG(candidate.type) || !HasAppleDoubleName(candidate)) return true;
    const Object object = ObjectAt({directory, candidate.name}, candidate.type);
    const int type = ReadableType(object.type);
    const bool may_be = MayBeMetadata(*directory, candidate, type);
    if (may_be && directory->IsNotedAsMetadata(candidate.name)) return false;
    // Where a list tells nobody any more whether there was an object, both may have gone.
    if (!may_be && directory->listed()) return true;
    if (!directory->Has(candidate.name)) return false;
    return !may_be || !IsMetadata(*directory, candidate, type);
}

std::vector<Directory::Entry> ObjectsIn(const DirectoryRef& directory) {
    std::vector<Directory::Entry> entries = CandidatesIn(directory);
    std::erase_if(entries,
                  [&](const Directory::Entry& entry) { return !IsObject(directory, entry); });
    return entries;
}

bool MayShareNames(const std::string& name) { return name.size() >= kUnchangedMax; }

std::optional<std::string> SharesNames(const Place& place) {
    if (!MayShareNames(place.name)) return std::nullopt;
    const std::string derived = NameInEaDirectory(place.name);
    for (const Directory::Entry& entry : place.directory->Entries()) {
        if (!MayShareNames(entry.name) || entry.name == place.name) continue;
        if (NameInEaDirectory(entry.name) == derived) return entry.name;
    }
    return std::nullopt;
}

void RequireOwnNames(const Object& object) {
    if (object.keeping() == Keeping::kAppleDouble) return;
    const auto other = SharesNames(object.place);
    if (!other) return;
    throw Failure(kFailed, object.path(),
                  "its metadata would have the same names as that of " +
                      Printable(object.place.directory->PathOf(*other)),
                  "give one of the two a shorter name, by another tool if it has metadata");
}

void RequireOwnNames(const Object& object, const Sidecars& sidecars) {
    if (sidecars.AnyByName()) RequireOwnNames(object);
}

std::vector<std::string> MayBelongTo(const Directory& directory, const std::string& name) {
    std::vector<std::string> objects;
    if (directory.Has(name)) objects.push_back(name);
    for (std::size_t at = name.find('@'); at != std::string::npos; at = name.find('@', at + 1)) {
        const std::string object = name.substr(0, at);
        if (object.empty()) continue;
        if (directory.Has(object)) objects.push_back(object);
        if (object.size() != kUnchangedMax) continue;
        for (const Directory::Entry& entry : directory.Entries()) {
            if (entry.name.size() > kUnchangedMax && NameInEaDirectory(entry.name) == object) {
                objects.push_back(entry.name);
            }
        }
    }
    return objects;
}

bool BelongsToAnObject(const Directory& directory, const std::string& name) {
    return !MayBelongTo(directory, name).empty();
}

std::vector<LeftOver> FindLeftOver(const Directory& directory, const Directory& ea_dir) {
    // By the list, where there is one: most of what is there is of objects that it has.
    const auto has_object = [&](const std::string& name) {
        return (directory.listed() && HadOwnerAtFirst(directory, name, 1)) ||
               BelongsToAnObject(directory, name);
    };
    std::vector<LeftOver> all;
    const auto add = [&](const auto& self, const Directory& in, const std::string& prefix) -> void {
        for (const Directory::Entry& entry : in.Entries()) {
            const bool top = prefix.empty();
            if (top && entry.name == kCoverName && S_ISREG(entry.type)) continue;
            if (entry.name.starts_with(kOwnPrefix)) continue;
            if (top && has_object(entry.name)) continue;
            const auto info = in.StatusOf(entry.name);
            if (!info) continue;
            if (S_ISDIR(info->st_mode)) {
                self(self, *in.OpenIn(entry.name), prefix + entry.name + '/');
            } else {
                all.push_back({{in.shared_from_this(), entry.name, *info}, prefix + entry.name});
            }
        }
    };
    add(add, ea_dir, {});
    return all;
}

void RemoveEaDirectoryIfEmpty(const Directory& directory) {
    if (leaves_ea_directories) {
        left_ea_directory = true;
        return;
    }
    if (!directory.MayHave(kEaDirName) || directory.RemoveEmpty(kEaDirName)) return;
    const DirectoryRef ea_dir = directory.FindAgain(kEaDirName);
    if (!ea_dir || !ea_dir->MayHave(kCoverName)) return;
    const auto cover = ea_dir->StatusOf(kCoverName);
    if (!cover || !S_ISREG(cover->st_mode) || ea_dir->Entries().size() != 1) return;
    (void)ea_dir->RemoveFile(kCoverName);
    (void)directory.RemoveEmpty(kEaDirName);
}

void LeaveEmptyEaDirectories() { leaves_ea_directories = true; }

bool TakeLeftEaDirectory() { return std::exchange(left_ea_directory, false); }

void RemoveLeftEaDirectory(const Directory& directory) {
    directory.NoteCome(kEaDirName);
    directory.Forget(kEaDirName);
    RemoveEaDirectoryIfEmpty(directory);
}

DirectoryRef NeedEaDirectory(const Directory& directory) {
    DirectoryRef found = directory.FindAgain(kEaDirName);
    // Services tidy up as well.
    if (found && found->Status().st_nlink > 0) return found;
    if (DryRun()) {
        const int error = ::geteuid() == 0 ? WhyNoNewFile(directory) : EPERM;
        if (error == 0) return nullptr;
        throw LibraryFailure(directory.PathOf(kEaDirName), {MAVOEA_ERR_MAKE_DIRECTORY, error});
    }
    const ErrorMark mark;
    if (MAVOEAMKDir(0, directory.ProcPath(kEaDirName).c_str()) != 0) {
        throw LibraryFailure(directory.PathOf(kEaDirName), mark.Get());
    }
    directory.NoteCome(kEaDirName);
    directory.Forget(kEaDirName);
    if (DirectoryRef made = directory.FindAgain(kEaDirName)) return made;
    throw SystemFailure(directory.PathOf(kEaDirName), ENOENT);
}

}  // namespace mavoea::tool

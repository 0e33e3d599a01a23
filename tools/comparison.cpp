#include "tools/comparison.h"

#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <map>
#include <set>
#include <string_view>

#include "include/mavoea.h"
#include "platform/attribute_word.h"
#include "tools/contents.h"
#include "tools/file.h"
#include "tools/layout.h"
#include "tools/lock.h"
#include "tools/messages.h"
#include "tools/record.h"
#include "tools/sidecar.h"
#include "tools/store.h"
#include "util/volume_kind.h"

namespace mavoea::tool {
namespace {

using Aspect = Difference::Aspect;
using What = Difference::What;

constexpr const char* kHeadsAreCut =
    "between these volumes only the Finder info and the resource fork of a header are copied";

struct stat StatusOf(const Object& object) {
    struct stat info;
    if (::lstat(object.path.c_str(), &info) != 0) throw SystemFailure(object.path, errno);
    return info;
}

// What a volume that is only copied to holds is read as it will be by those who copied.
Object AsReadable(Object object) {
    constexpr int kEaDirectoryType = 1;
    if (VolumeKindOf(object.type) == VolumeKind::kDestinationOnly) object.type = kEaDirectoryType;
    return object;
}

// The first place where they differ; none when they are the same.
template <class Range>
std::optional<std::uint64_t> FirstDifference(const Range& one, const Range& other) {
    const auto [at, there] = std::mismatch(one.begin(), one.end(), other.begin(), other.end());
    if (at == one.end() && there == other.end()) return std::nullopt;
    return static_cast<std::uint64_t>(at - one.begin());
}

// ---- Attributes ---------------------------------------------------------------------------------

// Attributes that the system has with every file, on volumes that keep all of them in one place.
bool IsOfTheSystem(std::string_view name) {
    return name.starts_with("system.") || name.starts_with("security.") ||
           name.starts_with("trusted.");
}

// The marks of the file itself, which copies set anew. From volumes that keep attributes in one
// place they may have gone into EA streams, where they mean nothing.
bool IsMarks(std::string_view name) { return name == attribute_word::kName; }

bool MeansNothing(Kind kind, const Bytes& value) {
    switch (kind) {
        case Kind::kFinderInfo:
            return std::all_of(value.begin(), value.end(), [](auto byte) { return byte == 0; });
        case Kind::kResourceFork:
            return value.empty() || IsBlankFork(value);
        default:
            return false;
    }
}

bool CanHaveMetadata(const Object& object) {
    const char* id = nullptr;
    if (object.keeping() == Keeping::kAppleDouble) id = "appleDouble";
    if (object.keeping() == Keeping::kEaDirectory) id = "stream";
    if (id == nullptr) return true;
    for (const MetadataPath& place : MetadataPaths(object)) {
        if (std::string_view(place.id) == id) return !place.path.empty();
    }
    return true;
}

// What an object has. An object whose name is too long for metadata has none.
class Attributes {
 public:
    explicit Attributes(const Object& object) {
        if (!CanHaveMetadata(object)) return;
        store_ = OpenStore(object);
        for (const Attribute& attribute : store_->List()) {
            if (attribute.kind != Kind::kLocked) names_.insert(attribute.name);
        }
    }

    const std::set<std::string>& names() const { return names_; }

    std::optional<Bytes> Get(const std::string& name) const {
        if (!names_.contains(name)) return std::nullopt;
        std::optional<Bytes> value = store_->Get(name);
        if (value && MeansNothing(KindOf(name), *value)) return std::nullopt;
        return value;
    }

 private:
    std::unique_ptr<Store> store_;
    std::set<std::string> names_;
};

// Of the file itself, whatever its volume does with such.
std::optional<Bytes> InodeAttribute(const std::string& path, const std::string& name) {
    constexpr std::size_t kMost = 65536;
    Bytes value(kMost);
    const ssize_t size = ::lgetxattr(path.c_str(), name.c_str(), value.data(), value.size());
    if (size < 0) return std::nullopt;
    value.resize(static_cast<std::size_t>(size));
    return value;
}

// The library follows symbolic links, and opens what it is given: of other objects only what lies
// beside them can be asked for.
bool CanBeAsked(const struct stat& info, const Object& object) {
    if (S_ISREG(info.st_mode) || S_ISDIR(info.st_mode)) return true;
    const VolumeKind kind = VolumeKindOf(object.type);
    return kind == VolumeKind::kAppleDouble || kind == VolumeKind::kEADir;
}

// ---- Other entries of AppleDouble headers -------------------------------------------------------

using Entries = std::map<std::string, Bytes>;

// Without what every header has anew: dates that say nothing, and the lock, which is compared by
// itself.
bool SaysSomething(EntryId id, Bytes* bytes) {
    constexpr EntryId kFileDates{8};
    constexpr std::uint8_t kUnknownDate = 0x80;
    if (id == EntryId::kAfpFileInfo && bytes->size() >= kAfpFileInfoSize) {
        constexpr std::uint16_t kLocking = kAfpNoWrite | kAfpNoRename | kAfpNoDelete;
        constexpr std::uint16_t kLockedByLibrary = 0xA000;
        std::uint8_t* const word = &(*bytes)[kAfpAttributesOffset];
        StoreBe16(static_cast<std::uint16_t>(LoadBe16(word) & ~(kLocking | kLockedByLibrary)),
                  word);
    }
    return std::any_of(bytes->begin(), bytes->end(), [&](std::uint8_t byte) {
        return byte != 0 && (id != kFileDates || byte != kUnknownDate);
    });
}

void AddEntries(const Layout& layout, Entries* entries) {
    if (!layout.IsAppleDouble()) return;
    constexpr std::uint32_t kFirstPrivate = 0x80000000;  // netatalk's own business
    for (const auto& [index, contents] : layout.contents) {
        const EntryId id = layout.entries[index].id;
        Bytes bytes = contents;
        if (static_cast<std::uint32_t>(id) >= kFirstPrivate || !SaysSomething(id, &bytes)) continue;
        entries->emplace(EntryName(id), std::move(bytes));
    }
}

Entries EntriesOf(const Object& object) {
    Entries entries;
    const VolumeKind kind = VolumeKindOf(object.type);
    if (kind == VolumeKind::kFileEA) {
        if (const auto record = ReadStoredRecord(object, RecordPlace::kAttribute)) {
            AddEntries(ReadLayout(record->block), &entries);
        }
    }
    if (kind == VolumeKind::kAttribute || !CanHaveMetadata(object)) return entries;
    const int place = kind == VolumeKind::kAppleDouble ? EA_PLACE_APPLEDOUBLE : EA_PLACE_EADIR;
    const std::string path = Sidecar{object.path, MAVOEA_KIND_RESOURCE, place}.Path();
    if (Exists(path)) AddEntries(ReadLayout(File::OpenToRead(path)), &entries);
    return entries;
}

// ---- Words --------------------------------------------------------------------------------------

const char* WordOf(Aspect aspect) {
    switch (aspect) {
        case Aspect::kType:
            return "type";
        case Aspect::kData:
            return "data";
        case Aspect::kTarget:
            return "target";
        case Aspect::kAttribute:
            return "attribute";
        case Aspect::kEntry:
            return "entry";
        case Aspect::kObject:
            break;
    }
    return "object";
}

const char* WordOf(What what) {
    switch (what) {
        case What::kMissing:
            return "missing";
        case What::kExtra:
            return "extra";
        case What::kDifferent:
            break;
    }
    return "different";
}

}  // namespace

std::string DifferenceText(const Difference& difference) {
    std::string text = Printable(difference.path) + ": ";
    if (difference.aspect == Aspect::kAttribute) {
        text += '"' + Printable(difference.name) + "\": ";
    } else if (difference.aspect == Aspect::kEntry) {
        text += "AppleDouble " + difference.name + ": ";
    } else if (difference.aspect != Aspect::kObject) {
        text += std::string(WordOf(difference.aspect)) + ": ";
    }
    text += WordOf(difference.what);
    if (difference.offset) text += " at byte " + std::to_string(*difference.offset);
    if (difference.because != nullptr) text += std::string("; ") + difference.because;
    return text;
}

Json DifferenceJson(const Difference& difference) {
    Json json;
    json.SetText("path", difference.path);
    json.Set("aspect", WordOf(difference.aspect));
    if (!difference.name.empty()) json.SetText("name", difference.name);
    json.Set("what", WordOf(difference.what));
    if (difference.offset) json.Set("offset", *difference.offset);
    if (difference.because != nullptr) json.Set("because", difference.because);
    return json;
}

Comparison::Comparison(Object original, Object copy, const Receiver& receiver)
    : original_(AsReadable(std::move(original))),
      copy_(AsReadable(std::move(copy))),
      receiver_(receiver) {}

void Comparison::Run() {
    const auto try_to = [this](auto compare) {
        try {
            (this->*compare)();
        } catch (const Failure& failure) {
            receiver_.fails(failure);
        }
    };
    const struct stat info = StatusOf(original_);
    const struct stat there = StatusOf(copy_);
    if ((info.st_mode & S_IFMT) != (there.st_mode & S_IFMT)) {
        receiver_.differs({.path = original_.path, .aspect = Aspect::kType});
        return;
    }
    if (S_ISREG(info.st_mode)) try_to(&Comparison::CompareData);
    if (S_ISLNK(info.st_mode)) try_to(&Comparison::CompareTargets);
    if ((S_ISBLK(info.st_mode) || S_ISCHR(info.st_mode)) && info.st_rdev != there.st_rdev) {
        receiver_.differs({.path = original_.path, .aspect = Aspect::kTarget});
    }
    if (!CanBeAsked(info, original_) || !CanBeAsked(there, copy_)) return;
    try_to(&Comparison::CompareAttributes);
    if (S_ISREG(info.st_mode) || S_ISDIR(info.st_mode)) try_to(&Comparison::CompareLock);
    try_to(&Comparison::CompareEntries);
}

void Comparison::CompareData() {
    constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;
    const File original = File::OpenToRead(original_.path);
    const File copy = File::OpenToRead(copy_.path);
    for (std::uint64_t at = 0;; at += kPiece) {
        if (receiver_.give_up()) {
            throw Failure(kFailed, original_.path, "it was not compared to its end",
                          "compare again with --compare-only");
        }
        const Bytes piece = original.Read(at, kPiece);
        if (const auto offset = FirstDifference(piece, copy.Read(at, kPiece))) {
            receiver_.differs(
                {.path = original_.path, .aspect = Aspect::kData, .offset = at + *offset});
            return;
        }
        if (piece.size() < kPiece) return;
    }
}

void Comparison::CompareTargets() {
    const auto target_of = [](const std::string& path) {
        std::string target(PATH_MAX, '\0');
        const ssize_t size = ::readlink(path.c_str(), target.data(), target.size());
        if (size < 0) throw SystemFailure(path, errno);
        target.resize(static_cast<std::size_t>(size));
        return target;
    };
    if (const auto offset = FirstDifference(target_of(original_.path), target_of(copy_.path))) {
        receiver_.differs({.path = original_.path, .aspect = Aspect::kTarget, .offset = offset});
    }
}

void Comparison::CompareAttributes() {
    const Attributes original(original_);
    const Attributes copy(copy_);
    const bool in_inode =
        original_.keeping() == Keeping::kXattr || copy_.keeping() == Keeping::kXattr;
    std::set<std::string> names = original.names();
    names.insert(copy.names().begin(), copy.names().end());
    for (const std::string& name : names) {
        if (IsMarks(name) || (in_inode && IsOfTheSystem(name))) continue;
        const std::optional<Bytes> value = original.Get(name);
        const std::optional<Bytes> there = copy.Get(name);
        // An attribute that the original has as every file may have some.
        if (in_inode && !value && there && InodeAttribute(original_.path, name) == there) continue;
        CompareValues(Aspect::kAttribute, name, value, there);
    }
}

void Comparison::CompareLock() {
    const auto value = [](const Object& object) -> std::optional<Bytes> {
        return IsLocked(object) ? std::optional(Bytes{'1'}) : std::nullopt;
    };
    CompareValues(Aspect::kAttribute, std::string(kLockedName), value(original_), value(copy_));
}

void Comparison::CompareEntries() {
    const Entries original = EntriesOf(original_);
    const Entries copy = EntriesOf(copy_);
    const auto find = [](const Entries& entries, const std::string& name) {
        const auto found = entries.find(name);
        return found == entries.end() ? std::nullopt : std::optional(found->second);
    };
    std::set<std::string> names;
    for (const Entries* entries : {&original, &copy}) {
        for (const auto& [name, contents] : *entries) names.insert(name);
    }
    for (const std::string& name : names) {
        CompareValues(Aspect::kEntry, name, find(original, name), find(copy, name),
                      find(copy, name) ? nullptr : kHeadsAreCut);
    }
}

void Comparison::CompareValues(Aspect aspect, const std::string& name,
                               const std::optional<Bytes>& original,
                               const std::optional<Bytes>& copy, const char* because) {
    if (original == copy) return;
    Difference difference = {.path = original_.path, .aspect = aspect, .name = name};
    if (!copy) {
        difference.what = What::kMissing;
    } else if (!original) {
        difference.what = What::kExtra;
    } else {
        difference.offset = FirstDifference(*original, *copy);
    }
    difference.because = because;
    receiver_.differs(std::move(difference));
}

}  // namespace mavoea::tool

#include "tools/care/kept.h"

#include <fcntl.h>

#include <memory>

#include "tools/say/text.h"
#include "tools/store/content.h"
#include "tools/store/sidecars.h"
#include "util/fnv.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kKeptPrefix = ".mavoea-kept-";
constexpr std::size_t kNameMax = 255;

// No longer than the endings of the files that they are of, so that each name has room for them.
constexpr std::string_view kStreamEnding = "@MavoEAKept";
constexpr std::string_view kResourceEnding = "@MavoResKept";

std::string KeptAppleDouble(const std::string& object_name) {
    std::string name = std::string(kKeptPrefix) + "._" + object_name;
    if (name.size() <= kNameMax) return name;
    const std::string ending = '~' + HexNumber(Fnv::Of(object_name), 16).substr(2);
    return name.substr(0, kNameMax - ending.size()) + ending;
}

// Whole files are shared without being owned.
Content All(const File& file) {
    const auto shared = std::shared_ptr<const File>(&file, [](const File*) {});
    return {shared, 0, file.Size()};
}

}  // namespace

std::string KeptName(const std::string& object_name, KeptOf which) {
    switch (which) {
        case KeptOf::kStream:
            return NameInEaDirectory(object_name) + std::string(kStreamEnding);
        case KeptOf::kResource:
            return NameInEaDirectory(object_name) + std::string(kResourceEnding);
        case KeptOf::kAppleDouble:
            break;
    }
    return KeptAppleDouble(object_name);
}

bool IsKeptName(const std::string& name) {
    return name.starts_with(std::string(kKeptPrefix) + "._");
}

std::vector<Place> FindKept(const Object& object) {
    std::vector<Place> kept;
    const auto add = [&](const DirectoryRef& directory, KeptOf which) {
        const std::string name = KeptName(object.place.name, which);
        if (directory->MayHave(name) && directory->Has(name)) kept.push_back({directory, name});
    };
    if (object.is_root()) return kept;
    add(object.place.directory, KeptOf::kAppleDouble);
    const auto ea_dir = object.place.directory->StatusOf(kEaDirName);
    if (!ea_dir || !S_ISDIR(ea_dir->st_mode)) return kept;
    const DirectoryRef in = object.place.directory->FindAgain(kEaDirName);
    if (!in) return kept;
    add(in, KeptOf::kStream);
    add(in, KeptOf::kResource);
    return kept;
}

std::vector<Place> FindKeptOfNobody(const DirectoryRef& directory) {
    std::vector<Place> kept;
    for (const Directory::Entry& entry : directory->EntriesAtFirst()) {
        if (!IsKeptName(entry.name)) continue;
        const std::string start(kKeptPrefix);
        bool has_object = directory->Has(entry.name.substr(start.size() + 2));
        for (const Directory::Entry& other : directory->EntriesAtFirst()) {
            if (has_object || entry.name.size() < kNameMax) break;
            has_object = KeptAppleDouble(other.name) == entry.name;
        }
        if (!has_object) kept.push_back({directory, entry.name});
    }
    return kept;
}

std::string Keep(const File& file, const Place& kept, const Rights& rights) {
    std::string path = kept.path();
    if (const auto before = kept.directory->FindFile(kept.name, O_RDONLY)) {
        const bool same = before->Status().st_nlink == 1 && before->Size() == file.Size() &&
                          !FirstDifference(All(file), All(*before));
        if (same) return path;
        throw Failure(kFailed, path, "what an earlier repair has replaced is kept there",
                      "have it removed with: mavoea check --repair --yes PATH");
    }
    TemporaryFile temporary(kept);
    (void)WriteTo(temporary.file(), 0, All(file));
    if (temporary.file().Size() != file.Size() ||
        FirstDifference(All(file), All(temporary.file()))) {
        throw Failure(kFailed, path, "what was written is not what is read back", "check the disk");
    }
    rights.Give(temporary.file());
    temporary.file().Sync();
    temporary.GiveToNewTarget();
    kept.directory->Sync();
    return path;
}

}  // namespace mavoea::tool

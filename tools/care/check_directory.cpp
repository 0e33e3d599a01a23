#include "tools/care/check_directory.h"

#include <map>
#include <string>
#include <vector>

#include "tools/care/dangling.h"
#include "tools/care/kept.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

FindingKind KindOf(DanglingKind kind) {
    switch (kind) {
        case DanglingKind::kTemporary:
            return FindingKind::kLeftTemporaryFile;
        case DanglingKind::kPending:
            return FindingKind::kUnfinishedRename;
        case DanglingKind::kResourceCopy:
            return FindingKind::kUnfinishedRepair;
        case DanglingKind::kOther:
            return FindingKind::kDanglingServiceFile;
        case DanglingKind::kEaDirectory:
            return FindingKind::kEmptyEaDirectory;
        case DanglingKind::kAppleDouble:
        case DanglingKind::kStream:
        case DanglingKind::kResource:
        case DanglingKind::kLegacyFolder:
            break;
    }
    return FindingKind::kDanglingMetadata;
}

void FindWhatDangles(const DirectoryRef& directory, FindingSink* sink) {
    const auto info = directory->StatusOf(kEaDirName);
    const DirectoryRef ea_dir =
        info && S_ISDIR(info->st_mode) ? directory->FindIn(kEaDirName) : nullptr;
    const std::vector<Dangling> found = FindDangling(directory, ea_dir, false);
    for (const Dangling& one : found) {
        // It would be empty, once the others have gone.
        if (one.kind == DanglingKind::kEaDirectory && found.size() > 1) continue;
        sink->Add({KindOf(one.kind), one.holder->PathOf(one.name),
                   std::string(LabelOf(one.kind)) + ", " + one.because});
    }
}

void FindMoves(const Directory& directory, FindingSink* sink) {
    for (const Directory::Entry& entry : directory.EntriesAtFirst()) {
        if (!S_ISREG(entry.type) || !entry.name.starts_with(kMovingPrefix)) continue;
        sink->Add({FindingKind::kUnfinishedMove, directory.PathOf(entry.name),
                   "a move of an object to this directory has not ended"});
    }
}

// Those that are not shortened are in the way of the others.
void FindSharedNames(const DirectoryRef& directory, FindingSink* sink) {
    std::map<std::string, std::vector<std::string>> names;
    for (const Directory::Entry& entry : directory->EntriesAtFirst()) {
        if (MayShareNames(entry.name)) names[NameInEaDirectory(entry.name)].push_back(entry.name);
    }
    for (const auto& [derived, objects] : names) {
        for (std::size_t i = 1; i < objects.size(); ++i) {
            sink->Add(SharedNames({directory, objects[i]}, objects.front()));
        }
    }
}

}  // namespace

void CheckDirectory(const DirectoryRef& directory, FindingSink* sink) {
    FindWhatDangles(directory, sink);
    FindMoves(*directory, sink);
    for (const Place& kept : FindKeptOfNobody(directory)) sink->AddKept({}, kept.path());
    const Object inside = ObjectAt({directory, kEaDirName}, nullptr);
    if (inside.keeping() == Keeping::kEaDirectory) FindSharedNames(directory, sink);
}

Finding SharedNames(const Place& object, const std::string& other) {
    return {FindingKind::kSharedNames, object.path(),
            "its metadata would have the same names as that of " +
                Printable(object.directory->PathOf(other))};
}

bool IsOfTool(const Directory::Entry& entry) {
    if (S_ISDIR(entry.type)) return PendingOwner::Parse(entry.name).has_value();
    return IsTemporaryName(entry.name) || entry.name.starts_with(kMovingPrefix) ||
           IsKeptName(entry.name);
}

}  // namespace mavoea::tool

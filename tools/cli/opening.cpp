#include "tools/cli/opening.h"

#include "tools/place/dry_run.h"
#include "tools/say/output.h"
#include "tools/store/adoption.h"
#include "tools/store/reader.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

bool Holds(const Metadata& metadata, const std::string& name) {
    switch (KindOf(name)) {
        case Kind::kFinderInfo:
            return metadata.finder_info.has_value();
        case Kind::kResourceFork:
            return metadata.fork.has_value();
        case Kind::kAttribute:
        case Kind::kLocked:
            break;
    }
    return metadata.Find(name) != nullptr;
}

}  // namespace

std::unique_ptr<Changer> OpenToChange(const Object& object) {
    SettleNamed(object);
    auto changer = OpenChanger(object);
    std::vector<std::string> notes;
    AdoptForChange(object, &notes);
    for (const std::string& note : notes) Note(note);
    return changer;
}

bool RemoveFrom(const Object& object, const std::string& name) {
    if (OpenToChange(object)->Remove(name)) return true;
    // What an earlier version kept is still where it was.
    return DryRun() && Holds(ReadMetadata(object, Sidecars::Services::kLeaveOut), name);
}

}  // namespace mavoea::tool

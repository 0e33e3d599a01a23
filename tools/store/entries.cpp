#include "tools/store/entries.h"

#include <algorithm>

#include "tools/place/dry_run.h"
#include "tools/store/reader.h"
#include "tools/store/rewriting.h"

namespace mavoea::tool {
EntryChange::EntryChange(const Object& object)
    : object_(object), wanted_(ReadMetadata(object, Sidecars::Services::kFind)) {
    RequireRewritable(object_, wanted_);
}

Bytes EntryChange::Old(EntryId id) const {
    const auto there = wanted_.entries.find(id);
    return there == wanted_.entries.end() ? Bytes() : there->second.value.All();
}

void EntryChange::Set(EntryId id, Bytes value) {
    wanted_.entries.insert_or_assign(id, Metadata::Item{Content(std::move(value)), {}});
    changed_.insert(id);
    wanted_.ForgetFilesOfEntries();
}

void EntryChange::SetCreated(std::uint64_t created) {
    wanted_.created = created;
    changes_created_ = true;
}

void EntryChange::Expect(const std::string& name, const Bytes& value) {
    if (wanted_.Find(name) == nullptr) wanted_.attributes.push_back({name, Content(value), 0, {}});
}

std::vector<Missing> EntryChange::Fit() const { return FitChange().missing; }

std::vector<Missing> EntryChange::Write() const {
    if (changed_.empty() && !changes_created_) return {};
    const Fitting fit = FitChange();
    const Metadata& fitting = fit.metadata;
    std::vector<Missing> missing = fit.missing;
    const bool fits = std::any_of(changed_.begin(), changed_.end(),
                                  [&](EntryId id) { return fitting.entries.contains(id); });
    if ((!fits && !changes_created_) || DryRun()) return missing;
    Metadata found;
    const std::vector<Missing> lost = Rewrite(object_, fitting, {}, [&] {
        found = ReadMetadata(object_, Sidecars::Services::kFind);
        return found;
    });
    missing.insert(missing.end(), lost.begin(), lost.end());
    for (const EntryId id : changed_) {
        const auto wanted = fitting.entries.find(id);
        const bool gone = wanted != fitting.entries.end() && wanted->second.value.size() == 0;
        if (gone && found.entries.contains(id)) {
            missing.push_back({NameOfEntry(id), "it is there still"});
        }
    }
    return missing;
}

Fitting EntryChange::FitChange() const {
    std::vector<std::string> names;
    for (const EntryId id : changed_) names.push_back(NameOfEntry(id));
    return FitAll(object_, wanted_, names);
}

}  // namespace mavoea::tool

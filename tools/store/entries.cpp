#include "tools/store/entries.h"

#include <algorithm>

#include "tools/place/dry_run.h"
#include "tools/store/reader.h"
#include "tools/store/writer.h"

namespace mavoea::tool {
namespace {

constexpr const char* kSeeWhat = "see what it is with: mavoea list -l PATH";

}  // namespace

EntryChange::EntryChange(const Object& object)
    : object_(object), wanted_(ReadMetadata(object, Sidecars::Services::kFind)) {
    if (!wanted_.problems.empty()) throw Failure(wanted_.problems.front());
    if (wanted_.strays.empty()) return;
    throw Failure(kFailed, object_.path(), "writing them would lose " + wanted_.strays.front().item,
                  kSeeWhat);
}

Bytes EntryChange::Old(EntryId id) const {
    const auto there = wanted_.entries.find(id);
    return there == wanted_.entries.end() ? Bytes() : there->second.value.All();
}

void EntryChange::Set(EntryId id, Bytes value) {
    wanted_.entries.insert_or_assign(id, Metadata::Item{Content(std::move(value)), {}});
    changed_.insert(id);
    // They hold what was there.
    wanted_.whole_apple_double.reset();
    wanted_.whole_resource.reset();
    wanted_.whole_record.reset();
}

void EntryChange::SetCreated(std::uint64_t created) {
    wanted_.created = created;
    changes_created_ = true;
}

void EntryChange::Expect(const std::string& name, const Bytes& value) {
    if (wanted_.Find(name) == nullptr) wanted_.attributes.push_back({name, Content(value), 0, {}});
}

std::vector<Missing> EntryChange::Fit() const { return MakeFit().missing; }

std::vector<Missing> EntryChange::Write() const {
    if (changed_.empty() && !changes_created_) return {};
    const Fitting fit = MakeFit();
    const Metadata& fitting = fit.metadata;
    std::vector<Missing> missing = fit.missing;
    const bool fits = std::any_of(changed_.begin(), changed_.end(),
                                  [&](EntryId id) { return fitting.entries.contains(id); });
    if ((!fits && !changes_created_) || DryRun()) return missing;
    const Written written = WriterFor(object_).Write(object_, *Inode::Open(object_.place), fitting,
                                                     {.old = Old::kKept});
    missing.insert(missing.end(), written.missing.begin(), written.missing.end());
    const Metadata found = ReadMetadata(object_, Sidecars::Services::kFind);
    const std::vector<Missing> differing = WhatIsMissing(fitting, found);
    missing.insert(missing.end(), differing.begin(), differing.end());
    for (const EntryId id : changed_) {
        const auto wanted = fitting.entries.find(id);
        const bool gone = wanted != fitting.entries.end() && wanted->second.value.size() == 0;
        if (gone && found.entries.contains(id)) {
            missing.push_back({NameOfEntry(id), "it is there still"});
        }
    }
    return missing;
}

EntryChange::Fitting EntryChange::MakeFit() const {
    Fitting fitting;
    fitting.metadata = WriterFor(object_).Fit(wanted_, object_, &fitting.missing);
    for (const Missing& one : fitting.missing) {
        if (Brings(one.item)) continue;
        throw Failure(kFailed, object_.path(), "writing them would lose its " + one.item, kSeeWhat);
    }
    return fitting;
}

bool EntryChange::Brings(const std::string& item) const {
    return std::any_of(changed_.begin(), changed_.end(),
                       [&](EntryId id) { return NameOfEntry(id) == item; });
}

}  // namespace mavoea::tool

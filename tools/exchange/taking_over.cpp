#include "tools/exchange/taking_over.h"

#include <algorithm>

#include "tools/place/dry_run.h"
#include "tools/say/text.h"
#include "tools/store/adoption.h"
#include "tools/store/combination.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/reader.h"
#include "tools/store/rewriting.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

// Whether an object has that value, byte for byte.
bool Has(const Metadata& metadata, const std::string& name, const Content& value) {
    const auto same = [&](const Content& other) { return SameContent(value, other); };
    switch (KindOf(name)) {
        case Kind::kFinderInfo:
            return metadata.finder_info && same(metadata.finder_info->value);
        case Kind::kResourceFork:
            return metadata.fork && same(metadata.fork->value);
        default:
            break;
    }
    const Metadata::Attribute* const attribute = metadata.Find(name);
    return attribute != nullptr && same(attribute->value);
}

std::string FlagsOf(const std::string& name) { return "flags of " + NameOfAttribute(name); }

// As a writer calls them that has no place for them.
std::string NameOfService(const Metadata::ServiceFile& service) {
    return service.name == "._" ? "AppleDouble file " + Printable(service.holder)
                                : NameOfAttribute(service.name) + " of another service";
}

// What is neither an attribute's value, nor Finder info, fork or lock.
std::vector<std::string> RestOf(const Metadata& metadata) {
    std::vector<std::string> items;
    for (const auto& [id, item] : metadata.entries) items.push_back(NameOfEntry(id));
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        if (attribute.flags != 0) items.push_back(FlagsOf(attribute.name));
    }
    for (const Metadata::ServiceFile& service : metadata.services) {
        items.push_back(NameOfService(service));
    }
    if (metadata.hidden) items.emplace_back("hidden mark");
    if (metadata.system) items.emplace_back("system mark");
    if (metadata.archived) items.emplace_back("archive mark");
    if (metadata.created) items.emplace_back("creation time");
    return items;
}

}  // namespace

void SortOut(Metadata* metadata) {
    std::erase_if(metadata->entries, [](const auto& entry) {
        return !SaysSomething(entry.first, entry.second.value.All());
    });
    if (metadata->fork && IsBlankFork(metadata->fork->value)) metadata->fork.reset();
    std::erase_if(metadata->attributes, [&](const Metadata::Attribute& attribute) {
        switch (KindOf(attribute.name)) {
            case Kind::kAttribute:
                return false;
            case Kind::kFinderInfo:
                if (!metadata->finder_info && attribute.value.size() == kFinderInfoSize) {
                    metadata->finder_info = Metadata::Item{attribute.value, attribute.holder};
                    return true;
                }
                break;
            case Kind::kResourceFork:
                if (!metadata->fork && attribute.value.size() > 0) {
                    metadata->fork = Metadata::Item{attribute.value, attribute.holder};
                    return true;
                }
                break;
            case Kind::kLocked:
                break;
        }
        metadata->strays.push_back({"attribute " + NameOfAttribute(attribute.name),
                                    "its name means something else", attribute.holder});
        return true;
    });
}

// ---- TakingOver ---------------------------------------------------------------------------------

void TakingOver::Run(const Metadata& metadata) {
    AdoptForChange(object_, &notes_);
    SetValues(metadata);
    AddRest(metadata);
    for (const Metadata::Stray& stray : metadata.strays) Miss(stray.item, stray.reason);
    if (metadata.locked) Lock();
}

void TakingOver::Miss(const std::string& item, const std::string& reason) {
    missing_.push_back({item, reason});
    lost_.push_back({item, reason});
    failures_.push_back(Printable(object_.path()) + ": " + item + " was not taken over: " + reason);
    status_ = kFailed;
}

void TakingOver::Lock() {
    try {
        SetLocked(object_, true);
    } catch (const Failure& failure) {
        Miss("locked state", failure.cause());
    }
}

// What is there already need not be written, and is not when it cannot be.
void TakingOver::SetValues(const Metadata& metadata) {
    std::vector<Value> values;
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        values.push_back({attribute.name, &attribute.value});
    }
    if (const auto& info = metadata.finder_info) {
        values.push_back({std::string(kFinderInfoName), &info->value});
    }
    if (const auto& fork = metadata.fork) {
        values.push_back({std::string(kResourceForkName), &fork->value});
    }
    if (values.empty()) return;
    const Metadata former = ReadMetadata(object_, Sidecars::Services::kLeaveOut);
    std::erase_if(
        values, [&](const Value& one) { return Has(former, one.name, *one.content) || !Set(one); });
    if (values.empty()) return;
    const Metadata now = DryRun() ? metadata : ReadMetadata(object_, Sidecars::Services::kLeaveOut);
    for (const Value& one : values) {
        if (!Has(now, one.name, *one.content)) {
            Miss(NameOfAttribute(one.name), "what is there differs");
        }
        if (auto note = NoteOfUnseen(object_, one.name, one.content->size())) {
            notes_.push_back(*std::move(note));
        }
    }
}

bool TakingOver::Set(const Value& value) {
    try {
        changer_->Set(value.name, value.content->All());
        return true;
    } catch (const Failure& failure) {
        lost_.push_back({NameOfAttribute(value.name), failure.cause()});
        failures_.push_back(Printable(object_.path()) + ": \"" + Printable(value.name) +
                            "\" was not taken over: " + failure.what());
        status_ = std::max(status_, failure.status());
        return false;
    }
}

// Comment, dates and the like: the files are written anew, with what they hold and with these.
void TakingOver::AddRest(const Metadata& taken) {
    const std::vector<std::string> rest = RestOf(taken);
    if (rest.empty()) return;
    try {
        // Of the places of a value not all are rehearsed.
        Rehearsed::Forget();
        Metadata wanted = ReadMetadata(object_, Sidecars::Services::kFind);
        if (DryRun()) AddSet(taken, &wanted);
        if (!wanted.problems.empty()) throw Failure(wanted.problems.front());
        if (!Merge(taken, &wanted)) return;
        RequireRewritable(object_, wanted);
        wanted.ForgetFilesOfEntries();
        const Fitting fit = FitAll(object_, std::move(wanted), rest);
        for (const Missing& one : fit.missing) Miss(one.item, one.reason);
        if (fit.missing.size() == rest.size()) return;
        const auto read_back = [&] { return ReadMetadata(object_, Sidecars::Services::kFind); };
        for (const Missing& one : Rewrite(object_, fit.metadata, {}, read_back)) {
            Miss(one.item, one.reason);
        }
    } catch (const Failure& failure) {
        for (const std::string& item : rest) Miss(item, failure.cause());
    }
}

// What the object would have by now, if it is not in what was read.
void TakingOver::AddSet(const Metadata& taken, Metadata* there) const {
    const auto is_lost = [&](const std::string& name) {
        return std::any_of(lost_.begin(), lost_.end(),
                           [&](const Missing& one) { return one.item == NameOfAttribute(name); });
    };
    for (const Metadata::Attribute& attribute : taken.attributes) {
        if (is_lost(attribute.name) || Has(*there, attribute.name, attribute.value)) continue;
        std::erase_if(there->attributes,
                      [&](const Metadata::Attribute& one) { return one.name == attribute.name; });
        there->attributes.push_back({attribute.name, attribute.value, 0, {}});
        there->whole_stream.reset();
    }
    if (taken.finder_info && !is_lost(std::string(kFinderInfoName))) {
        there->finder_info = taken.finder_info;
    }
    if (taken.fork && !is_lost(std::string(kResourceForkName))) there->fork = taken.fork;
}

// False when all of it is there already.
bool TakingOver::Merge(const Metadata& taken, Metadata* wanted) const {
    bool changes = false;
    for (const auto& [id, item] : taken.entries) {
        const auto there = wanted->entries.find(id);
        const Bytes old = there == wanted->entries.end() ? Bytes() : there->second.value.All();
        const Bytes value = WithLockOf(id, item.value.All(), old);
        if (value == old || !SaysSomething(id, value)) continue;
        wanted->entries[id] = {Content(value), item.holder};
        changes = true;
    }
    for (const Metadata::Attribute& attribute : taken.attributes) {
        if (attribute.flags == 0) continue;
        for (Metadata::Attribute& one : wanted->attributes) {
            if (one.name != attribute.name || one.flags == attribute.flags) continue;
            one.flags = attribute.flags;
            wanted->whole_stream.reset();
            changes = true;
        }
    }
    for (const Metadata::ServiceFile& service : taken.services) {
        RequireOwnService(service.name);
        const auto there = std::find_if(
            wanted->services.begin(), wanted->services.end(),
            [&](const Metadata::ServiceFile& one) { return one.name == service.name; });
        if (there == wanted->services.end()) {
            wanted->services.push_back(service);
        } else if (FirstDifference(there->value, service.value)) {
            *there = service;
        } else {
            continue;
        }
        changes = true;
    }
    const auto mark = [&](bool is_set, bool* there) {
        changes = changes || (is_set && !*there);
        *there = *there || is_set;
    };
    mark(taken.hidden, &wanted->hidden);
    mark(taken.system, &wanted->system);
    mark(taken.archived, &wanted->archived);
    if (taken.created && taken.created != wanted->created) {
        wanted->created = taken.created;
        changes = true;
    }
    return changes;
}

// Failure for a file that would be taken for another object's.
void TakingOver::RequireOwnService(const std::string& name) const {
    const Place& place = object_.place;
    if (!name.starts_with('@')) return;
    for (const std::string& other :
         MayBelongTo(*place.directory, NameInEaDirectory(place.name) + name)) {
        // It belongs to the object with the longest name.
        if (other.size() <= place.name.size()) continue;
        throw Failure(kFailed, object_.path(),
                      NameOfAttribute(name) + " of another service would be a file of " +
                          NameOfAttribute(other),
                      "rename one of the two");
    }
}

}  // namespace mavoea::tool

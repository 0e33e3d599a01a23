#include "tools/care/strays.h"

#include <fcntl.h>

#include <algorithm>
#include <memory>
#include <optional>
#include <vector>

#include "include/mavoea.h"
#include "tools/care/whole_file.h"
#include "tools/say/text.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/reader.h"
#include "tools/store/rewriting.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

using Found = Sidecars::Found;

// An open file that lies in the wrong place, and what it holds.
struct StrayFile {
    Found found;
    std::shared_ptr<const File> file;
    Metadata holds;
    bool is_value = false;  // of one attribute, which has no flags there
};

// All files that may be strays. What volumes of the type have no use for is found by its name.
std::vector<Found> Candidates(const Object& object, const Sidecars& sidecars) {
    std::vector<Found> all = sidecars.attribute_files;
    if (sidecars.legacy_resource) all.push_back(*sidecars.legacy_resource);
    const auto add = [&](const DirectoryRef& directory, const std::string& name) {
        if (name.empty()) return;
        if (const auto info = directory->StatusOf(name)) all.push_back({directory, name, *info});
    };
    add(object.place.directory, AppleDoubleName(object.place.name));
    if (sidecars.ea_dir) {
        const std::string derived = NameInEaDirectory(object.place.name);
        add(sidecars.ea_dir, derived + "@" MAVOEA_KIND_STREAM);
        add(sidecars.ea_dir, derived + "@" MAVOEA_KIND_RESOURCE);
    }
    return all;
}

std::optional<StrayFile> FindStray(const Object& object, const std::string& path) {
    const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kLeaveOut);
    const std::vector<Found> all = Candidates(object, sidecars);
    const auto found =
        std::find_if(all.begin(), all.end(), [&](const Found& one) { return one.path() == path; });
    if (found == all.end()) return std::nullopt;
    StrayFile stray = {*found, OpenOwn(object, {found->directory, found->name}), {}, false};
    if (!stray.file) return std::nullopt;
    stray.is_value = std::any_of(sidecars.attribute_files.begin(), sidecars.attribute_files.end(),
                                 [&](const Found& one) { return one.path() == path; });
    if (stray.is_value) {
        stray.holds.attributes.push_back(
            {found->name, Content(stray.file, 0, stray.file->Size()), 0, path});
    } else {
        stray.holds = ReadWhole(stray.file);
    }
    return stray;
}

Metadata ReadCurrent(const Object& object) {
    Metadata metadata = ReadMetadata(object, Sidecars::Services::kFind);
    if (!metadata.problems.empty()) throw Failure(metadata.problems.front());
    return metadata;
}

[[noreturn]] void Refuse(const std::string& path, const std::string& item) {
    throw Failure(kFailed, path, "its " + item + " is another one than the object has",
                  "decide which is right, and set it");
}

bool Differ(const Content& one, const Content& other) {
    return one.size() != other.size() || FirstDifference(one, other).has_value();
}

// Adds what `wanted` has not. Whether there was anything; Failure where both have something else.
bool Add(const Metadata& holds, const std::string& path, Metadata* wanted) {
    bool any = false;
    const auto add = [&](const auto& item, auto* known, const std::string& name) {
        if (!item) return;
        if (!*known) {
            *known = *item;
            any = true;
        } else if (Differ((*known)->value, item->value)) {
            Refuse(path, name);
        }
    };
    add(holds.finder_info, &wanted->finder_info, "Finder info");
    add(holds.fork, &wanted->fork, "resource fork");
    for (const Metadata::Attribute& attribute : holds.attributes) {
        if (const Metadata::Attribute* const known = wanted->Find(attribute.name)) {
            if (Differ(known->value, attribute.value)) {
                Refuse(path, NameOfAttribute(attribute.name));
            }
            continue;
        }
        wanted->attributes.push_back(attribute);
        any = true;
    }
    for (const auto& [id, item] : holds.entries) {
        const auto [known, is_new] = wanted->entries.emplace(id, item);
        any = any || is_new;
        if (!is_new && Differ(known->second.value, item.value)) Refuse(path, NameOfEntry(id));
    }
    return any;
}

}  // namespace

bool AdoptStray(const Object& object, const std::string& path) {
    const auto stray = FindStray(object, path);
    if (!stray) return false;
    Metadata wanted = ReadCurrent(object);
    if (!Add(stray->holds, path, &wanted)) return true;
    RequireDeclared(object);
    RequireOwnNames(object);
    RequireRewritable(object, wanted);
    wanted.ForgetFiles();
    const Fitting fit = FitAll(object, std::move(wanted), NamesOfItems(stray->holds));
    if (!fit.missing.empty()) {
        throw Failure(kFailed, path, "its place does not hold all of it: " + Joined(fit.missing),
                      "mavoea get what is needed, and remove the file");
    }
    // The stream may have had what goes into the resource file.
    const std::vector<Missing> missing = Rewrite(object, fit.metadata, {.first = First::kResource},
                                                 [&] { return ReadCurrent(object); });
    if (missing.empty()) return true;
    throw Failure(kFailed, path, "not all of it has arrived: " + Joined(missing),
                  "give the command again");
}

void RequireAllOf(const Object& object, Metadata wanted) {
    const Metadata current = ReadCurrent(object);
    wanted.locked = current.locked;  // which no file says
    const std::vector<Missing> missing = WhatIsMissing(wanted, current);
    if (missing.empty()) return;
    throw Failure(kFailed, object.path(),
                  "the object has something else by now: " + Joined(missing),
                  "remove it yourself if that is right");
}

void RemoveStray(const Object& object, const std::string& path) {
    auto stray = FindStray(object, path);
    if (!stray) return;
    if (stray->is_value) {
        Metadata::Attribute& value = stray->holds.attributes.front();
        const Metadata current = ReadCurrent(object);
        if (const auto* const known = current.Find(value.name)) value.flags = known->flags;
    }
    RequireAllOf(object, std::move(stray->holds));
    // What has been compared is on disk before anything goes.
    stray->found.directory->SyncVolume();
    RemoveFiles({stray->found});
    stray->found.directory->Sync();
    RemoveEmptyDirectories(object, Sidecars::Find(object, Sidecars::Services::kLeaveOut));
}

}  // namespace mavoea::tool

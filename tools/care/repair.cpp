#include "tools/care/repair.h"

#include <fcntl.h>

#include <algorithm>

#include "include/mavoea.h"
#include "tools/care/upgrade.h"
#include "tools/care/whole_file.h"
#include "tools/place/dry_run.h"
#include "tools/say/messages.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/reader.h"
#include "tools/store/rewriting.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

// Whether the resource file wrongly holds attributes.
bool HoldsAttributes(const Metadata& metadata) {
    if (!metadata.whole_resource) return false;
    const std::string& path = metadata.whole_resource->path();
    const auto in_it = [&](const Metadata::Attribute& attribute) {
        return attribute.holder == path;
    };
    return std::any_of(metadata.attributes.begin(), metadata.attributes.end(), in_it);
}

// Both files are written anew, with what is known of them and nothing else.
void RefuseToLose(const Metadata& metadata) {
    for (const WholeFile& whole : {metadata.whole_resource, metadata.whole_stream}) {
        if (!whole) continue;
        for (const Metadata::Stray& stray : metadata.strays) {
            if (stray.holder != whole->path()) continue;
            throw Failure(kFailed, whole->path(), "a repair would lose " + stray.item,
                          "move the file away if that is no loss");
        }
    }
    if (!metadata.problems.empty()) throw Failure(metadata.problems.front());
}

bool Holds(const WholeFile& file, const std::optional<Metadata::Item>& item) {
    return file && item && item->holder == file->path();
}

// What of the stream goes into the resource file.
bool HoldsMore(const WholeFile& stream, const Metadata& metadata) {
    return Holds(stream, metadata.finder_info) || Holds(stream, metadata.fork) ||
           std::any_of(metadata.entries.begin(), metadata.entries.end(),
                       [&](const auto& entry) { return Holds(stream, entry.second); });
}

// Of two files that are written one after the other each has something that the other gets. So the
// stream first gets what is in the resource file, and keeps what it has: whichever then is written
// first, nothing is in neither.
void JoinInStream(const Object& object, const Sidecars& sidecars, const Metadata& metadata) {
    Metadata more;
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        if (attribute.holder == metadata.whole_resource->path()) {
            more.attributes.push_back(attribute);
        }
    }
    AddToStream(object, {sidecars.stream->directory, sidecars.stream->name}, more);
}

}  // namespace

Outcome RepairObject(const Object& volume_object) {
    // The record of a file-EA volume has no part in it.
    constexpr int kEaDirectoryType = 1;
    const Object object = {volume_object.place, kEaDirectoryType};
    const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kFind);
    if (!sidecars.resource) return Outcome::kNothing;
    // The resource file has the last word on an attribute that the stream has as well.
    Metadata metadata = ReadMetadata(object, sidecars);
    if (!HoldsAttributes(metadata)) {
        for (const Failure& problem : metadata.problems) {
            if (problem.subject() == sidecars.resource->path()) throw Failure(problem);
        }
        return Outcome::kNothing;
    }
    const std::string resource = metadata.whole_resource->path();
    std::erase_if(metadata.strays, [&](const Metadata::Stray& stray) {
        return metadata.whole_stream && stray.holder == metadata.whole_stream->path() &&
               stray.attribute;
    });
    RefuseToLose(metadata);
    RequireDeclared(object);
    RequireOwnNames(object);
    const bool joins = HoldsMore(metadata.whole_stream, metadata);
    const Metadata found = metadata;
    metadata.whole_resource.reset();
    metadata.whole_stream.reset();
    metadata.strays.clear();
    std::vector<Missing> missing;
    const Metadata fitting = WriterFor(object).Fit(metadata, object, &missing);
    if (!missing.empty()) {
        throw Failure(
            kFailed, resource,
            "a repair would lose its " + missing.front().item + ": " + missing.front().reason,
            "move the file away if that is no loss");
    }
    if (joins && !DryRun()) JoinInStream(object, sidecars, found);
    const std::vector<Missing> lost =
        Rewrite(object, fitting, {.first = joins ? First::kResource : First::kStream},
                [&] { return ReadMetadata(object, Sidecars::Services::kFind); });
    if (lost.empty()) return Outcome::kDone;
    throw Failure(kFailed, resource,
                  "not all of it arrived: " + lost.front().item + " (" + lost.front().reason + ')',
                  "look at it with: mavoea dump FILE");
}

ExitStatus Repair(const TreeOptions& options) {
    return RunOnTree(
        options, {.doing = "repairing",
                  .done = "repaired",
                  .current = nullptr,
                  .nothing = "with nothing to repair",
                  .check = RequireEaDirectory,
                  .work = [](const Object& object, Notes*) { return RepairObject(object); },
                  .on_named = SettleNamed,
                  .on_directory = [](const DirectoryRef& inside) { (void)SettlePending(inside); }});
}

}  // namespace mavoea::tool

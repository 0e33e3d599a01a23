#include "tools/store/rewriting.h"

#include <algorithm>
#include <utility>

#include "tools/place/dry_run.h"

namespace mavoea::tool {
namespace {

Failure WouldLose(const Object& object, const std::string& item) {
    return {kFailed, object.path(), "writing its metadata anew would lose " + item,
            "see what it is with: mavoea list -l PATH"};
}

}  // namespace

void RequireRewritable(const Object& object, const Metadata& there) {
    if (!there.problems.empty()) throw Failure(there.problems.front());
    if (!there.strays.empty()) throw WouldLose(object, there.strays.front().item);
}

Fitting FitAll(const Object& object, Metadata wanted, const std::vector<std::string>& added) {
    Fitting fit;
    fit.metadata = WriterFor(object).Fit(std::move(wanted), object, &fit.missing);
    for (const Missing& one : fit.missing) {
        const bool is_new = std::find(added.begin(), added.end(), one.item) != added.end();
        if (!is_new) throw WouldLose(object, "its " + one.item);
    }
    return fit;
}

std::vector<std::string> NamesOfItems(const Metadata& added) {
    std::vector<std::string> names;
    for (const Missing& one : ItemsOf(added, {})) names.push_back(one.item);
    for (const Metadata::Attribute& attribute : added.attributes) {
        names.push_back("flags of " + NameOfAttribute(attribute.name));
    }
    return names;
}

std::vector<Missing> Rewrite(const Object& object, const Metadata& fitting,
                             const WriteOptions& options,
                             const std::function<Metadata()>& read_back) {
    WriteOptions keeping = options;
    keeping.old = Old::kKept;
    std::vector<Missing> missing =
        WriterFor(object).Write(object, *Inode::Open(object.place), fitting, keeping).missing;
    if (DryRun()) return missing;
    const std::vector<Missing> differing = WhatIsMissing(fitting, read_back());
    missing.insert(missing.end(), differing.begin(), differing.end());
    return missing;
}

}  // namespace mavoea::tool

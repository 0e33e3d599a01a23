#include "tools/transfer/own_attributes.h"

#include <algorithm>

#include "platform/dos_attributes.h"
#include "tools/store/marks.h"

namespace mavoea::tool {

bool TravelsAsMetadata(const std::string& attribute, const Object& from, const Object& to) {
    if (IsMark(attribute)) return true;
    if (attribute == kDosAttributesName) return false;
    if (from.dialect() != nullptr) return IsForeign(attribute, *from.dialect());
    if (!from.declared && IsForeignInAny(attribute)) return true;
    if (IsOfRecord(attribute)) {
        return from.kind() == VolumeKind::kFileEA || to.kind() == VolumeKind::kFileEA;
    }
    if (from.keeping() != Keeping::kXattr || to.keeping() == Keeping::kXattr) return false;
    return !attribute.starts_with("system.") && !attribute.starts_with("security.") &&
           !attribute.starts_with("trusted.");
}

bool KeepsInInode(const Object& object) {
    return object.keeping() == Keeping::kXattr || object.kind() == VolumeKind::kFileEA ||
           object.dialect() != nullptr;
}
bool KeepsForkInInode(const Object& object) {
    if (const Dialect* const dialect = object.dialect()) {
        return dialect->fork == Dialect::Fork::kAttribute;
    }
    return object.keeping() == Keeping::kXattr;
}

const std::vector<std::string>& OwnAttributes::Names() const {
    if (!names_) {
        names_ = source_->AttributeNames();
        std::erase_if(*names_,
                      [&](const std::string& one) { return TravelsAsMetadata(one, from_, to_); });
    }
    return *names_;
}

bool OwnAttributes::Has(const std::string& name) const {
    return std::find(Names().begin(), Names().end(), name) != Names().end();
}

void OwnAttributes::AddWithoutRoom(const Inode& foreseen, std::vector<Missing>* missing) const {
    for (const std::string& name : Names()) {
        if (name.starts_with("system.")) continue;  // those of permissions
        const auto value = source_->Attribute(name);
        if (!value) continue;
        try {
            foreseen.SetAttribute(name, *value);
        } catch (const Failure& failure) {
            missing->push_back({"extended attribute " + NameOfAttribute(name), failure.cause()});
        }
    }
}

std::optional<Spelling> OwnAttributes::SpellingThere(const std::string& name) const {
    const Dialect* const dialect = to_.dialect();
    return dialect == nullptr ? Spelling{name, Spelling::Datum::kAttribute}
                              : SpellAttribute(name, *dialect);
}

bool OwnAttributes::HasAs(const Metadata::Attribute& there) const {
    const auto spelling = SpellingThere(there.name);
    return spelling && Has(spelling->attribute) && spelling->Value(*source_) == there.value.All();
}

void OwnAttributes::AddWrittenOver(const Metadata& fitting, std::vector<Missing>* missing) const {
    if (!KeepsInInode(to_) || to_.kind() == VolumeKind::kFileEA) return;
    const auto add = [&](const std::string& item, const Spelling& there, const Content* value) {
        if (!Has(there.attribute)) return;
        const auto own = source_->Attribute(there.attribute);
        if (!own) return;
        if (value != nullptr) {
            Bytes written = value->All();
            if (there.has_nul) written.push_back(0);
            if (written == *own) return;
        }
        missing->push_back({"extended attribute " + NameOfAttribute(there.attribute),
                            "its " + item + " has that name there"});
    };
    for (const Metadata::Attribute& attribute : fitting.attributes) {
        const auto there = SpellingThere(attribute.name);
        if (there) add(NameOfAttribute(attribute.name), *there, &attribute.value);
    }
    const Dialect* const dialect = to_.dialect();
    if (dialect == nullptr) return;
    if (fitting.finder_info) add("Finder info", SpellFinderInfo(*dialect), nullptr);
    if (fitting.fork && KeepsForkInInode(to_)) {
        add("resource fork", SpellFork(*dialect), nullptr);
    }
}

}  // namespace mavoea::tool

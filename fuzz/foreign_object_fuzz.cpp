// Everything that other programs may have kept of an object in its attributes, read as one of their
// dialects: a byte that chooses it; then for each attribute a byte that chooses a name, or the
// bytes of one behind its length, the length of the value in two bytes, and its bytes.

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "fuzz/foreign_names.h"
#include "fuzz/support/platform.h"
#include "tools/place/attribute_source.h"
#include "tools/place/volume.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/foreign/reader.h"
#include "tools/store/metadata.h"
#include "tools/store/saved.h"

using namespace mavoea;
using namespace mavoea::tool;
using mavoea::fuzz::Fail;
using mavoea::fuzz::kForeignNames;

namespace {

class Attributes final : public AttributeSource {
 public:
    explicit Attributes(ByteView input) {
        while (!input.empty()) {
            const std::size_t choice = Take(&input, 1)[0];
            std::string name;
            if (choice < kForeignNames.size()) {
                name = kForeignNames[choice];
            } else {
                const ByteView bytes = Take(&input, choice - kForeignNames.size() + 1);
                name = "user." + std::string(bytes.begin(), bytes.end());
                std::erase(name, '\0');
            }
            const ByteView size = Take(&input, 2);
            if (size.size() < 2) break;
            const ByteView value = Take(&input, std::size_t{size[0]} << 8 | size[1]);
            if (values_.emplace(name, Bytes(value.begin(), value.end())).second) {
                names_.push_back(name);
                total_ += value.size();
            }
        }
    }

    const std::string& path() const override { return path_; }
    std::vector<std::string> AttributeNames() const override { return names_; }
    std::optional<Bytes> Attribute(const std::string& name) const override {
        const auto found = values_.find(name);
        return found == values_.end() ? std::nullopt : std::optional(found->second);
    }
    std::size_t total() const { return total_; }

 private:
    static ByteView Take(ByteView* from, std::size_t size) {
        const ByteView taken = from->first(std::min(size, from->size()));
        *from = from->subspan(taken.size());
        return taken;
    }

    std::string path_ = "object";
    std::map<std::string, Bytes> values_;
    std::vector<std::string> names_;
    std::size_t total_ = 0;
};

const Dialect& DialectFor(std::uint8_t choice) {
    constexpr std::array<const char*, 6> kNames = {
        "samba", "samba-stream", "samba-all-streams", "netatalk", "netatalk-samba", "linux"};
    if (choice % 7 == 6) return AnyDialect();
    return *DialectOf(TypeFromName(kNames[choice % 7], "fuzz"));
}

Metadata Read(const Dialect& dialect, const Attributes& object, Certainty certainty) {
    Metadata metadata;
    AddForeignAttributes(dialect, object, object.AttributeNames(), certainty, &metadata);
    if (const auto dos = DosAttributesOf(object)) {
        TakeDosAttributes(*dos, LockedBy::kDosAttributes, &metadata);
    }
    TakeMarksFromWord(&metadata);
    return metadata;
}

// What has been read is no more than there is: values are the object's own bytes, but for fixed
// fields, which are spelled out.
void CheckSizes(const Metadata& metadata, const Attributes& object) {
    constexpr std::size_t kFixed = 64;
    std::uint64_t total = 0;
    for (const auto& attribute : metadata.attributes) {
        total += attribute.value.size();
        if (attribute.name.empty()) Fail("an attribute without a name");
    }
    if (metadata.fork) total += metadata.fork->value.size();
    if (metadata.finder_info) {
        if (metadata.finder_info->value.size() != 32) Fail("Finder info of another size");
        if (metadata.finder_info->value.All() == Bytes(32)) Fail("Finder info that says nothing");
    }
    for (const auto& [id, item] : metadata.entries) total += item.value.size();
    if (total > object.total() + kFixed) Fail("more than there is");
}

void CheckSame(const Metadata& one, const Metadata& other) {
    const auto missing = WhatIsMissing(one, other);
    if (!missing.empty()) Fail("%s: %s", missing[0].item.c_str(), missing[0].reason.c_str());
    if (one.attributes.size() != other.attributes.size()) Fail("other attributes");
    if (one.locked != other.locked || one.hidden != other.hidden || one.system != other.system ||
        one.created != other.created) {
        Fail("other marks");
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0) return 0;
    const Dialect& dialect = DialectFor(data[0]);
    const Attributes object({data + 1, size - 1});
    const Metadata metadata = Read(dialect, object, Certainty::kAny);
    CheckSizes(metadata, object);
    CheckSame(metadata, Read(dialect, object, Certainty::kAny));
    (void)Read(dialect, object, Certainty::kCertain);

    // As a text has it, it is the same.
    std::vector<Missing> missing;
    SavedAttributes saved("text");
    for (const SavedItem& item : SavedItems(metadata, &missing)) {
        saved.Set(item.attribute, item.value.All(), TextEncoding::kHex);
    }
    const Metadata again = ReadSaved(saved, -1).metadata;
    for (const Missing& one : WhatIsMissing(metadata, again)) {
        const bool told = std::any_of(missing.begin(), missing.end(),
                                      [&](const Missing& other) { return other.item == one.item; });
        // What is of no known size is named by who reads the text.
        if (!told && again.problems.empty()) Fail("%s: %s", one.item.c_str(), one.reason.c_str());
    }
    return 0;
}

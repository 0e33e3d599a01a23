#include "tools/store/combination.h"

#include <algorithm>
#include <optional>
#include <utility>

namespace mavoea::tool {
namespace {

class Combination {
 public:
    Combination(Metadata* there, Wins wins, std::vector<std::string>* differing)
        : there_(*there), wins_(wins), differing_(*differing) {}

    bool Run(const Metadata& other) {
        for (const Metadata::Attribute& attribute : other.attributes) AddAttribute(attribute);
        if (other.finder_info) AddItem("Finder info", *other.finder_info, &there_.finder_info);
        if (other.fork) {
            if (there_.fork && IsBlankFork(there_.fork->value)) there_.fork.reset();
            AddItem("resource fork", *other.fork, &there_.fork);
        }
        for (const auto& [id, item] : other.entries) AddEntry(id, item);
        return changed_;
    }

 private:
    // Whether the other's value takes the place of one that differs.
    bool Takes(const std::string& item) {
        differing_.push_back(item);
        return wins_ == Wins::kOther;
    }

    void AddAttribute(const Metadata::Attribute& attribute) {
        const auto at = std::find_if(
            there_.attributes.begin(), there_.attributes.end(),
            [&](const Metadata::Attribute& one) { return one.name == attribute.name; });
        if (at == there_.attributes.end()) {
            there_.attributes.push_back(attribute);
        } else if (SameContent(at->value, attribute.value) ||
                   !Takes(NameOfAttribute(attribute.name))) {
            return;
        } else {
            *at = attribute;
        }
        changed_ = true;
    }

    void AddItem(const char* name, const Metadata::Item& item,
                 std::optional<Metadata::Item>* there) {
        if (*there && (SameContent((*there)->value, item.value) || !Takes(name))) return;
        *there = item;
        changed_ = true;
    }

    void AddEntry(EntryId id, const Metadata::Item& item) {
        const auto there = there_.entries.find(id);
        const Bytes old = there == there_.entries.end() ? Bytes() : there->second.value.All();
        Bytes value = WithLockOf(id, item.value.All(), old);
        if (value == old || !SaysSomething(id, value)) return;
        if (!old.empty() && !Takes(NameOfEntry(id))) return;
        there_.entries[id] = {Content(std::move(value)), item.holder};
        changed_ = true;
    }

    Metadata& there_;
    const Wins wins_;
    std::vector<std::string>& differing_;
    bool changed_ = false;
};

}  // namespace

Bytes WithLockOf(EntryId id, Bytes bytes, const Bytes& old) {
    bytes = WithoutLock(id, std::move(bytes));
    if (id != EntryId::kAfpFileInfo || bytes.size() < kAfpFileInfoSize ||
        old.size() < bytes.size()) {
        return bytes;
    }
    const std::uint16_t kept = LoadBe16(&old[kAfpAttributesOffset]) &
                               ~LoadBe16(&WithoutLock(id, old)[kAfpAttributesOffset]);
    std::uint8_t* const word = &bytes[kAfpAttributesOffset];
    StoreBe16(static_cast<std::uint16_t>(LoadBe16(word) | kept), word);
    return bytes;
}

bool Combine(const Metadata& other, Wins wins, Metadata* there,
             std::vector<std::string>* differing) {
    return Combination(there, wins, differing).Run(other);
}

}  // namespace mavoea::tool

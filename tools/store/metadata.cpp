#include "tools/store/metadata.h"

#include <algorithm>

#include "tools/say/text.h"
#include "tools/store/layout.h"

namespace mavoea::tool {
namespace {

constexpr const char* kNotThere = "it is not there";
constexpr const char* kFinderInfoItem = "Finder info";
constexpr const char* kForkItem = "resource fork";

std::optional<std::string> Compare(const Content& wanted, const Content& found) {
    if (wanted.damaged()) return "it is damaged: " + wanted.problem();
    if (const auto at = FirstDifference(wanted, found)) {
        return "what is there differs at byte " + std::to_string(*at);
    }
    return std::nullopt;
}

std::optional<std::string> Compare(const std::optional<Metadata::Item>& wanted,
                                   const std::optional<Metadata::Item>& found) {
    if (!wanted) return std::nullopt;
    if (!found) {
        return wanted->value.damaged() ? "it is damaged: " + wanted->value.problem() : kNotThere;
    }
    return Compare(wanted->value, found->value);
}

}  // namespace

const Metadata::Attribute* Metadata::Find(std::string_view name) const {
    const auto found = std::find_if(attributes.begin(), attributes.end(),
                                    [&](const Attribute& one) { return one.name == name; });
    return found == attributes.end() ? nullptr : &*found;
}

void Metadata::ForgetFiles() {
    ForgetFilesOfEntries();
    whole_stream.reset();
}

void Metadata::ForgetFilesOfEntries() {
    whole_apple_double.reset();
    whole_resource.reset();
    whole_record.reset();
}

std::optional<std::uint16_t> Metadata::AfpAttributes() const {
    const auto found = entries.find(EntryId::kAfpFileInfo);
    if (found == entries.end() || found->second.value.damaged()) return std::nullopt;
    const Bytes info = found->second.value.All();
    if (info.size() < kAfpFileInfoSize) return std::nullopt;
    return LoadBe16(&info[kAfpAttributesOffset]);
}

std::string NameOfAttribute(const std::string& name) { return '"' + Printable(name) + '"'; }

std::string NameOfEntry(EntryId id) {
    std::string name = EntryName(id);
    if (name != "unknown") return name;
    return "entry of id " + HexNumber(static_cast<std::uint32_t>(id));
}

std::vector<Missing> WhatIsMissing(const Metadata& wanted, const Metadata& found) {
    std::vector<Missing> missing;
    const auto add = [&](const std::string& item, const std::optional<std::string>& reason) {
        if (reason) missing.push_back({item, *reason});
    };
    std::map<std::string_view, const Metadata::Attribute*> there;
    for (const Metadata::Attribute& attribute : found.attributes) {
        there[attribute.name] = &attribute;
    }
    for (const Metadata::Attribute& attribute : wanted.attributes) {
        const auto at = there.find(attribute.name);
        if (at == there.end()) {
            add(NameOfAttribute(attribute.name), kNotThere);
            continue;
        }
        add(NameOfAttribute(attribute.name), Compare(attribute.value, at->second->value));
        if (attribute.flags != at->second->flags) {
            add("flags of " + NameOfAttribute(attribute.name), "what is there differs");
        }
    }
    add(kFinderInfoItem, Compare(wanted.finder_info, found.finder_info));
    add(kForkItem, Compare(wanted.fork, found.fork));
    for (const auto& [id, item] : wanted.entries) {
        const auto at = found.entries.find(id);
        if (at == found.entries.end()) {
            const Bytes bytes = item.value.damaged() ? Bytes{1} : WithoutLock(id, item.value.All());
            if (SaysSomething(id, bytes)) add(NameOfEntry(id), kNotThere);
        } else if (!SaysAll(id, at->second.value.All(), item.value.All())) {
            add(NameOfEntry(id), "what is there differs");
        }
    }
    std::map<std::string_view, const Metadata::ServiceFile*> services;
    for (const Metadata::ServiceFile& file : found.services) services[file.name] = &file;
    for (const Metadata::ServiceFile& file : wanted.services) {
        const auto at = services.find(file.name);
        add(NameOfAttribute(file.name) + " of another service",
            at == services.end() ? std::optional<std::string>(kNotThere)
                                 : Compare(file.value, at->second->value));
    }
    if (wanted.locked != found.locked) {
        add("locked state",
            found.locked ? "what is there is locked" : "what is there is not locked");
    }
    if (wanted.hidden && !found.hidden) add("hidden mark", "it could not be set");
    if (wanted.system && !found.system) add("system mark", "it could not be set");
    if (wanted.created && wanted.created != found.created) {
        add("creation time", "it could not be set");
    }
    return missing;
}

void RemoveItems(const std::vector<Missing>& missing, Metadata* metadata) {
    for (const Missing& one : missing) {
        const std::string& item = one.item;
        std::erase_if(metadata->attributes, [&](const Metadata::Attribute& attribute) {
            return NameOfAttribute(attribute.name) == item;
        });
        std::erase_if(metadata->entries,
                      [&](const auto& entry) { return NameOfEntry(entry.first) == item; });
        if (item == kFinderInfoItem) metadata->finder_info.reset();
        if (item == kForkItem) metadata->fork.reset();
    }
}

std::vector<Missing> ItemsOf(const Metadata& metadata, const std::string& reason) {
    std::vector<Missing> items;
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        items.push_back({NameOfAttribute(attribute.name), reason});
    }
    if (metadata.finder_info) items.push_back({kFinderInfoItem, reason});
    if (metadata.fork && !IsBlankFork(metadata.fork->value)) {
        items.push_back({kForkItem, reason});
    }
    for (const auto& [id, item] : metadata.entries) {
        if (item.value.damaged() || SaysSomething(id, item.value.All())) {
            items.push_back({NameOfEntry(id), reason});
        }
    }
    return items;
}

Json MissingJson(const std::vector<Missing>& missing) {
    Json list = Json::Array();
    for (const Missing& one : missing) {
        Json entry;
        entry.SetText("name", one.item);
        entry.SetText("reason", one.reason);
        list.Add(std::move(entry));
    }
    return list;
}

std::string Joined(const std::vector<Missing>& missing) {
    constexpr std::size_t kMost = 20;
    std::string text;
    for (std::size_t i = 0; i < missing.size() && i < kMost; ++i) {
        text += (i == 0 ? "" : ", ") + missing[i].item + " (" + missing[i].reason + ')';
    }
    if (missing.size() > kMost) {
        text += " and " + std::to_string(missing.size() - kMost) + " more";
    }
    return text;
}

bool SaysSomething(EntryId id, const Bytes& bytes) {
    constexpr std::uint8_t kUnknown = 0x80;
    const Bytes meant = WithoutLock(id, bytes);
    return std::any_of(meant.begin(), meant.end(), [&](std::uint8_t byte) {
        return byte != 0 && (id != EntryId::kFileDates || byte != kUnknown);
    });
}

std::optional<Bytes> JoinedDates(Bytes dates, const Bytes& others) {
    if (dates.size() != kFileDatesSize || others.size() != kFileDatesSize) return std::nullopt;
    for (std::size_t at = 0; at < kFileDatesSize; at += sizeof kUnknownDate) {
        const std::uint32_t date = LoadBe32(&dates[at]);
        const std::uint32_t other = LoadBe32(&others[at]);
        if (date == other || other == kUnknownDate) continue;
        if (date != kUnknownDate) return std::nullopt;
        StoreBe32(other, &dates[at]);
    }
    return dates;
}

bool SaysAll(EntryId id, const Bytes& there, const Bytes& wanted) {
    const Bytes bytes = WithoutLock(id, there);
    if (bytes == WithoutLock(id, wanted)) return true;
    return id == EntryId::kFileDates && JoinedDates(bytes, wanted) == bytes;
}

Bytes WithoutLock(EntryId id, Bytes bytes) {
    if (id != EntryId::kAfpFileInfo || bytes.size() < kAfpFileInfoSize) return bytes;
    constexpr std::uint16_t kLockedByLibrary = 0xA000;
    std::uint8_t* const word = &bytes[kAfpAttributesOffset];
    StoreBe16(static_cast<std::uint16_t>(LoadBe16(word) & ~(kAfpLocking | kLockedByLibrary)), word);
    return bytes;
}

bool IsBlankFork(const Content& fork) {
    if (fork.damaged() || fork.size() <= kBlankForkTextOffset + kBlankForkText.size()) return false;
    const Bytes text = fork.Read(kBlankForkTextOffset, kBlankForkText.size());
    return std::equal(
        text.begin(), text.end(), kBlankForkText.begin(), kBlankForkText.end(),
        [](std::uint8_t byte, char c) { return byte == static_cast<std::uint8_t>(c); });
}

bool IsAllZero(ByteView bytes) {
    return std::all_of(bytes.begin(), bytes.end(), [](std::uint8_t byte) { return byte == 0; });
}

}  // namespace mavoea::tool

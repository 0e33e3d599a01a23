#include "tools/move/import.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>
#include <iostream>
#include <memory>

#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/store/adoption.h"
#include "tools/store/change.h"
#include "tools/store/reader.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

// Finder info and fork have entries of their own; as attributes they count where those are empty.
// The locked state is no metadata that a "._" file could bring.
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

// The AFP word locks what it locked before, and nothing else.
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

std::string Joined(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) text += (text.empty() ? "" : ", ") + word;
    return text;
}

class ObjectImport {
 public:
    explicit ObjectImport(const Object& object) : object_(object), changer_(OpenChanger(object)) {}

    void Run(const Metadata& metadata) {
        AdoptForChange(object_, &notes_);
        for (const Metadata::Attribute& attribute : metadata.attributes) {
            Set(attribute.name, attribute.value);
        }
        if (metadata.finder_info) Set(std::string(kFinderInfoName), metadata.finder_info->value);
        if (metadata.fork) Set(std::string(kResourceForkName), metadata.fork->value);
        AddEntries(metadata);
        for (const Metadata::Stray& stray : metadata.strays) Miss(stray.item, stray.reason);
    }

    const std::vector<std::string>& notes() const { return notes_; }
    const std::vector<Missing>& missing() const { return missing_; }
    const std::vector<std::string>& failures() const { return failures_; }
    ExitStatus status() const { return status_; }

 private:
    void Miss(const std::string& item, const std::string& reason) {
        missing_.push_back({item, reason});
        failures_.push_back(Printable(object_.path()) + ": " + item +
                            " was not taken over: " + reason);
        status_ = kFailed;
    }

    void Set(const std::string& name, const Content& value) {
        try {
            // What is there already need not be written, and is not when it cannot be.
            if (Has(name, value)) return;
            changer_->Set(name, value.All());
            if (!Has(name, value)) Miss(NameOfAttribute(name), "what is there differs");
        } catch (const Failure& failure) {
            failures_.push_back(Printable(object_.path()) + ": \"" + Printable(name) +
                                "\" was not taken over: " + failure.what());
            status_ = std::max(status_, failure.status());
        }
    }

    bool Has(const std::string& name, const Content& value) const {
        const Metadata now = ReadMetadata(object_, Sidecars::Services::kLeaveOut);
        const auto same = [&](const Content& other) {
            return !other.damaged() && other.size() == value.size() &&
                   !FirstDifference(value, other);
        };
        switch (KindOf(name)) {
            case Kind::kFinderInfo:
                return now.finder_info && same(now.finder_info->value);
            case Kind::kResourceFork:
                return now.fork && same(now.fork->value);
            default:
                break;
        }
        const Metadata::Attribute* const attribute = now.Find(name);
        return attribute != nullptr && same(attribute->value);
    }

    // Comment, dates and the like: the files are written anew, with what they hold and with these.
    void AddEntries(const Metadata& imported) {
        if (imported.entries.empty()) return;
        try {
            Metadata wanted = ReadMetadata(object_, Sidecars::Services::kFind);
            if (!wanted.problems.empty()) throw Failure(wanted.problems.front());
            if (!wanted.strays.empty()) {
                throw Failure(kFailed, object_.path(),
                              "writing them would lose " + wanted.strays.front().item,
                              "see what it is with: mavoea list -l PATH");
            }
            bool changes = false;
            for (const auto& [id, item] : imported.entries) {
                const auto there = wanted.entries.find(id);
                const Bytes old =
                    there == wanted.entries.end() ? Bytes() : there->second.value.All();
                const Bytes value = WithLockOf(id, item.value.All(), old);
                if (value == old || !SaysSomething(id, value)) continue;
                wanted.entries[id] = {Content(value), item.holder};
                changes = true;
            }
            if (!changes) return;
            wanted.whole_apple_double.reset();
            wanted.whole_resource.reset();
            wanted.whole_record.reset();
            std::vector<Missing> missing;
            const Writer& writer = WriterFor(object_);
            const Metadata fitting = writer.Fit(wanted, object_, &missing);
            for (const Missing& one : missing) {
                if (Brings(imported, one.item)) continue;
                throw Failure(kFailed, object_.path(), "writing them would lose its " + one.item,
                              "see what it is with: mavoea list -l PATH");
            }
            for (const Missing& one : missing) Miss(one.item, one.reason);
            if (fitting.entries.empty()) return;
            const Written written =
                writer.Write(object_, *Inode::Open(object_.place), fitting, {.old = Old::kKept});
            for (const Missing& one : written.missing) Miss(one.item, one.reason);
            const Metadata found = ReadMetadata(object_, Sidecars::Services::kFind);
            for (const Missing& one : WhatIsMissing(fitting, found)) Miss(one.item, one.reason);
        } catch (const Failure& failure) {
            for (const auto& [id, item] : imported.entries) Miss(NameOfEntry(id), failure.cause());
        }
    }

    static bool Brings(const Metadata& imported, const std::string& item) {
        return std::any_of(imported.entries.begin(), imported.entries.end(),
                           [&](const auto& entry) { return NameOfEntry(entry.first) == item; });
    }

    const Object& object_;
    std::unique_ptr<Changer> changer_;
    std::vector<std::string> notes_;
    std::vector<Missing> missing_;
    std::vector<std::string> failures_;
    ExitStatus status_ = kSuccess;
};

void PrintText(const std::string& path, const Metadata& metadata) {
    std::vector<std::string> words;
    if (const std::size_t count = metadata.attributes.size(); count > 0) {
        words.push_back(std::to_string(count) + (count == 1 ? " attribute" : " attributes"));
    }
    if (metadata.finder_info) words.emplace_back("Finder info");
    if (metadata.fork) {
        words.push_back("resource fork of " + std::to_string(metadata.fork->value.size()) +
                        " bytes");
    }
    for (const auto& [id, item] : metadata.entries) words.push_back(NameOfEntry(id));
    if (words.empty()) words.emplace_back("nothing to take over");
    std::cout << Printable(path) << ": " << Joined(words) << '\n';
}

Json ImportJson(const std::string& source, const std::string& path, const Metadata& metadata,
                const ObjectImport& import) {
    Json json;
    json.SetText("path", path);
    json.SetText("appleDouble", source);
    Json attributes = Json::Array();
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        Json entry;
        entry.SetText("name", attribute.name);
        entry.Set("size", attribute.value.size());
        attributes.Add(std::move(entry));
    }
    json.Set("attributes", std::move(attributes));
    json.Set("finderInfo", metadata.finder_info.has_value());
    json.Set("resourceFork", metadata.fork ? metadata.fork->value.size() : 0);
    Json missing = Json::Array();
    for (const Missing& one : import.missing()) {
        Json entry;
        entry.SetText("name", one.item);
        entry.SetText("reason", one.reason);
        missing.Add(std::move(entry));
    }
    json.Set("notTakenOver", std::move(missing));
    SetMessages(json, "failures", import.failures());
    return json;
}

// A link at the end of its path is not followed: others may have put it there.
std::shared_ptr<const File> OpenSource(const std::string& path) {
    const Place place = PlaceOf(path, Shown::kWhole);
    if (auto file = place.directory->FindFile(place.name, O_RDONLY)) return file;
    throw SystemFailure(path, ENOENT);
}

}  // namespace

ExitStatus Import(const std::string& apple_double, const std::string& path, bool json) {
    const Object object = FindObject(path);
    SettleNamed(object);
    ObjectImport import(object);
    Metadata metadata = ReadAppleDoubleFile(OpenSource(apple_double));
    SortOut(&metadata);
    import.Run(metadata);
    if (json) {
        Print(ImportJson(apple_double, object.path(), metadata, import));
    } else if (import.failures().empty()) {
        PrintText(path, metadata);
    }
    for (const std::string& note : import.notes()) Note(note);
    for (const std::string& failure : import.failures()) Report(failure);
    return import.status();
}

}  // namespace mavoea::tool

#include "tools/care/whole_file.h"

#include <fcntl.h>

#include <algorithm>
#include <map>
#include <vector>

#include "tools/say/text.h"
#include "tools/store/apple_double_reader.h"
#include "tools/store/encoding.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/locking.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

constexpr const char* kSalvage = "mavoea salvage PATH DIR writes out what can be read";

// A part of a file, and what it is called.
struct Stretch {
    std::uint64_t offset;
    std::uint64_t end;
    std::string name;
};

class Wholeness {
 public:
    Wholeness(const Layout& layout, const File& file) : layout_(layout), file_(file) {}

    std::optional<std::string> Run() {
        if (!layout_.IsAppleDouble()) return "it is no AppleDouble file";
        if (layout_.header->version != kAppleDoubleVersion2) return "it is of an unknown version";
        if (layout_.entries.size() < layout_.header->entry_count) {
            return "it ends inside its descriptors";
        }
        Take(0, DescriptorsEnd(layout_.header->entry_count), "its header");
        if (auto why = TakeEntries()) return why;
        if (auto why = TakeAttributes()) return why;
        if (auto why = Collision()) return why;
        return Unclaimed();
    }

 private:
    void Take(std::uint64_t offset, std::uint64_t end, std::string name) {
        if (offset < end) parts_.push_back({offset, end, std::move(name)});
    }

    std::optional<std::string> TakeEntries() {
        std::map<EntryId, Range> seen;
        for (const EntryDescriptor& entry : layout_.entries) {
            const std::string name = std::string("its ") + EntryName(entry.id);
            const auto [other, is_first] = seen.emplace(entry.id, entry.data);
            if (!is_first) {
                if (other->second == entry.data) continue;
                return name + " is there twice";
            }
            if (entry.data.length == 0) continue;
            if (entry.data.end() > layout_.file_size) return name + " passes its end";
            if (entry.id != EntryId::kFinderInfo) {
                Take(entry.data.offset, entry.data.end(), name);
                continue;
            }
            if (entry.data.length < kFinderInfoSize) return name + " has too few bytes";
            Take(entry.data.offset, entry.data.offset + std::uint64_t{kFinderInfoSize}, name);
        }
        return std::nullopt;
    }

    std::optional<std::string> TakeAttributes() {
        if (!layout_.HasAttributeArea()) return std::nullopt;
        if (!layout_.attributes) return "it ends inside its attribute header";
        if (layout_.attributes->magic != kAttributeMagic) {
            return "what is behind its Finder info is of no known kind";
        }
        if (layout_.records.size() < layout_.attributes->count) {
            return "it ends inside its attribute table";
        }
        Take(kAttributeHeaderOffset, layout_.TableEnd(), "its attribute table");
        std::map<std::string, const Layout::Record*> seen;
        for (const Layout::Record& record : layout_.records) {
            const std::string name = record.name();
            if (name.empty() || name.size() + 1 != record.stored_name.size()) {
                return "an attribute's name is damaged";
            }
            const std::string attribute = "its attribute " + NameOfAttribute(name);
            const Range value = record.fixed.value;
            if (!seen.emplace(name, &record).second) return attribute + " is there twice";
            if (value.length == 0) continue;
            if (value.end() > layout_.file_size) return attribute + " passes its end";
            Take(value.offset, value.end(), attribute);
        }
        return std::nullopt;
    }

    // Of two parts that share bytes one has been written over.
    std::optional<std::string> Collision() {
        std::stable_sort(parts_.begin(), parts_.end(),
                         [](const Stretch& a, const Stretch& b) { return a.offset < b.offset; });
        for (std::size_t i = 1; i < parts_.size(); ++i) {
            if (parts_[i].offset >= parts_[i - 1].end) continue;
            return parts_[i].name + " lies over " + parts_[i - 1].name;
        }
        return std::nullopt;
    }

    // What no part has may be one that the header does not tell of any more.
    std::optional<std::string> Unclaimed() const {
        std::uint64_t end = 0;
        for (const Stretch& part : parts_) {
            if (!IsBlank(end, part.offset)) return WhereNobody(end, part.offset);
            end = part.end;
        }
        if (!IsBlank(end, layout_.file_size)) return WhereNobody(end, layout_.file_size);
        return std::nullopt;
    }

    static std::string WhereNobody(std::uint64_t offset, std::uint64_t end) {
        return "something is in its bytes " + std::to_string(offset) + " to " +
               std::to_string(end - 1) + " that belongs to no part of it";
    }

    bool IsBlank(std::uint64_t offset, std::uint64_t end) const {
        while (offset < end) {
            const Bytes bytes = file_.Read(offset, std::min(end - offset, kSmallFile));
            if (bytes.empty()) return true;
            if (!IsAllZero(bytes)) return false;
            offset += bytes.size();
        }
        return true;
    }

    const Layout& layout_;
    const File& file_;
    std::vector<Stretch> parts_;
};

void RequireWhole(const Layout& layout, const File& file) {
    if (layout.file_size == 0) return;
    const auto why = WhyNotWhole(layout, file);
    if (why) throw Failure(kFailed, file.path(), *why, kSalvage, Fault::kDamage);
}

// netatalk's own entries are not read.
void RequireNothingPrivate(const Layout& layout, const File& file) {
    for (const EntryDescriptor& entry : layout.entries) {
        const bool own = SlotOf(static_cast<std::uint32_t>(entry.id)) >= Slot::kPrivateDevice;
        if (!own || entry.data.length == 0) continue;
        throw Failure(
            kFailed, file.path(),
            std::string("writing it anew would lose its entry \"") + EntryName(entry.id) + '"',
            kSalvage);
    }
}

// Whether both say the same, entry by entry and byte by byte.
std::vector<Missing> Differences(const Metadata& wanted, const Metadata& found) {
    std::vector<Missing> missing = WhatIsMissing(wanted, found);
    for (const auto& [id, item] : wanted.entries) {
        const auto there = found.entries.find(id);
        const bool same = there != found.entries.end() &&
                          there->second.value.size() == item.value.size() &&
                          !FirstDifference(item.value, there->second.value);
        if (!same) missing.push_back({NameOfEntry(id), "what is there differs"});
    }
    return missing;
}

Pieces PiecesOf(const Metadata& metadata, KeptOf which) {
    if (which == KeptOf::kStream && metadata.entries.empty()) return EncodeStream(metadata);
    Pieces pieces = EncodeAppleDouble(metadata);
    return pieces.empty() ? EncodePlain(metadata) : pieces;
}

// The same in a new file.
void Fill(const std::shared_ptr<const File>& file, const Metadata& all, const Layout& old,
          KeptOf which) {
    std::vector<Missing> missing;
    Metadata fitting = all;
    FitAppleDouble(&fitting, &missing);
    if (!missing.empty()) {
        throw Failure(kFailed, file->path(),
                      "a new one has no place for all of it: " + Joined(missing), kSalvage);
    }
    std::uint64_t end = 0;
    for (const Content& piece : PiecesOf(fitting, which)) end = WriteTo(*file, end, piece);
    if (which == KeptOf::kAppleDouble) {  // who has written it counts for Samba
        constexpr std::uint64_t kFillerOffset = 8;
        file->Write(kFillerOffset, old.header->filler);
    }
    Metadata found;
    ReadFile(file, &found);
    const std::vector<Missing> lost = Differences(all, found);
    if (lost.empty() && found.problems.empty() &&
        CheckLayout(ReadLayout(*file)).violations.empty()) {
        return;
    }
    throw Failure(kFailed, file->path(),
                  "what was written is not what is read back" +
                      (lost.empty() ? std::string() : ": " + Joined(lost)),
                  "check the disk");
}

bool IsUnchanged(const struct stat& before, const struct stat& now) {
    return SameFile(before, now) && before.st_size == now.st_size &&
           before.st_mtim.tv_sec == now.st_mtim.tv_sec &&
           before.st_mtim.tv_nsec == now.st_mtim.tv_nsec;
}

// Puts a new file that holds `all` in the place of `file`, which is open there and locked;
// `before_it_goes` is called when the new one is on disk.
template <class Work>
void Replace(const Object& object, const FileOfObject& own, const std::shared_ptr<const File>& file,
             const Metadata& all, Work before_it_goes) {
    const struct stat before = file->Status();
    const Rights rights = Rights::Of(*Inode::Open(object.place));
    TemporaryFile written(own.file);
    Fill(written.shared_file(), all, ReadLayout(*file), own.which);
    rights.Give(written.file());
    written.file().Sync();
    before_it_goes(written.file(), rights);
    const auto now = own.file.Status();
    if (!now || !IsUnchanged(before, *now)) {
        throw Failure(kFailed, own.file.path(), "somebody has changed it meanwhile",
                      "give the command again");
    }
    written.GiveToTarget();
    own.file.directory->Sync();
}

}  // namespace

std::optional<std::string> WhyNotWhole(const Layout& layout, const File& file) {
    return Wholeness(layout, file).Run();
}

Metadata ReadWhole(const std::shared_ptr<const File>& file) {
    const Layout layout = ReadLayout(*file);
    RequireWhole(layout, *file);
    Metadata metadata;
    ReadFile(file, &metadata);
    const bool only_many = layout.header && layout.header->entry_count > kStreamDescriptorMax;
    if (!metadata.problems.empty() && !only_many) throw Failure(metadata.problems.front());
    if (!metadata.strays.empty()) {
        const Metadata::Stray& stray = metadata.strays.front();
        throw Failure(kFailed, file->path(), stray.item + ": " + stray.reason, kSalvage);
    }
    metadata.problems.clear();
    return metadata;
}

std::string WhatCanBeRead(const std::shared_ptr<const File>& file) {
    Metadata metadata;
    ReadFile(file, &metadata);
    std::string text;
    std::size_t more = 0;
    const auto add = [&](const std::string& item, const Content& value) {
        constexpr std::size_t kMost = 500;
        const std::uint64_t readable = value.Readable().size();
        if (readable == 0 && value.size() > 0) return;
        if (text.size() > kMost) {
            ++more;
            return;
        }
        if (!text.empty()) text += ", ";
        text += item;
        if (readable < value.size()) {
            text +=
                " (" + std::to_string(readable) + " of " + std::to_string(value.size()) + " bytes)";
        }
    };
    if (metadata.finder_info) add("Finder info", metadata.finder_info->value);
    for (const auto& one : metadata.attributes) add(NameOfAttribute(one.name), one.value);
    for (const auto& [id, item] : metadata.entries) add(NameOfEntry(id), item.value);
    if (metadata.fork) add("resource fork", metadata.fork->value);
    return more == 0 ? text : text + " and " + std::to_string(more) + " more";
}

void RequireShared(const Inode& object, const File& file) {
    const struct stat info = file.Status();
    const bool third = info.st_uid != object.info().st_uid && info.st_uid != 0;
    if (!third || (info.st_mode & S_IROTH) != 0) return;
    throw Failure(kFailed, file.path(), "it belongs to another user, who has kept it from others",
                  "chown it if it is the object's");
}

std::shared_ptr<const File> OpenOwn(const Object& object, const Place& place) {
    auto file = place.directory->FindFile(place.name, O_RDWR);
    if (!file) return nullptr;
    LockFile(*file, Access::kWrite);
    if (file->Status().st_nlink > 1) {
        throw Failure(kFailed, file->path(), "it has several names",
                      "make it a file of its own: copy it, and put the copy in its place");
    }
    RequireShared(*Inode::Open(object.place), *file);
    return file;
}

std::string WriteAnew(const Object& object, const FileOfObject& own, WhyIgnored why_ignored) {
    RequireDeclared(object);
    if (own.which != KeptOf::kAppleDouble) RequireOwnNames(object);
    const auto file = OpenOwn(object, own.file);
    if (!file) throw SystemFailure(own.file.path(), ENOENT);
    RequireNothingPrivate(ReadLayout(*file), *file);
    std::string kept;
    Replace(object, own, file, ReadWhole(file), [&](const File& written, const Rights& rights) {
        const auto why = why_ignored != nullptr ? why_ignored(ReadLayout(written)) : std::nullopt;
        if (why) {
            throw Failure(kFailed, own.file.path(), "a new one would be ignored as well: " + *why,
                          kSalvage);
        }
        const Place place = {own.file.directory, KeptName(object.place.name, own.which)};
        kept = Keep(*file, place, rights);
    });
    return kept;
}

void AddToStream(const Object& object, const Place& stream, const Metadata& more) {
    const auto file = OpenOwn(object, stream);
    if (!file) throw SystemFailure(stream.path(), ENOENT);
    Metadata all = ReadWhole(file);
    for (const Metadata::Attribute& attribute : more.attributes) {
        std::erase_if(all.attributes,
                      [&](const auto& known) { return known.name == attribute.name; });
        all.attributes.push_back(attribute);
    }
    Replace(object, {stream, KeptOf::kStream}, file, all, [](const File&, const Rights&) {});
}

}  // namespace mavoea::tool

#include "tools/transfer/comparison.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <map>
#include <set>

#include "tools/place/dry_run.h"
#include "tools/store/foreign/marks.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/metadata.h"
#include "tools/store/reader.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"

namespace mavoea::tool {
namespace {

using Aspect = Difference::Aspect;
using What = Difference::What;

const char* WordOf(Aspect aspect) {
    switch (aspect) {
        case Aspect::kType:
            return "type";
        case Aspect::kData:
            return "data";
        case Aspect::kTarget:
            return "target";
        case Aspect::kAttribute:
            return "attribute";
        case Aspect::kEntry:
            return "entry";
        case Aspect::kService:
            return "service";
        case Aspect::kObject:
            break;
    }
    return "object";
}

const char* WordOf(What what) {
    switch (what) {
        case What::kMissing:
            return "missing";
        case What::kExtra:
            return "extra";
        case What::kDifferent:
            break;
    }
    return "different";
}

constexpr char kCreated[] = "mavoea.created";

// What an object has, by what people call it.
struct Key {
    Aspect aspect;
    std::string name;
    friend auto operator<=>(const Key&, const Key&) = default;
};
using Values = std::map<Key, Content>;

Content One() { return Content(Bytes{'1'}); }

Values ValuesOf(const Metadata& metadata) {
    Values values;
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        values[{Aspect::kAttribute, attribute.name}] = attribute.value;
    }
    if (metadata.finder_info) {
        values[{Aspect::kAttribute, std::string(kFinderInfoName)}] = metadata.finder_info->value;
    }
    if (metadata.fork && !IsBlankFork(metadata.fork->value)) {
        values[{Aspect::kAttribute, std::string(kResourceForkName)}] = metadata.fork->value;
    }
    if (metadata.locked) values[{Aspect::kAttribute, std::string(kLockedName)}] = One();
    if (metadata.hidden) values[{Aspect::kAttribute, "mavoea.hidden"}] = One();
    if (metadata.system) values[{Aspect::kAttribute, "mavoea.system"}] = One();
    if (metadata.created) {
        const std::string time = std::to_string(*metadata.created);
        values[{Aspect::kAttribute, kCreated}] = Content(Bytes(time.begin(), time.end()));
    }
    for (const auto& [id, item] : metadata.entries) {
        Content value = item.value;
        if (!value.damaged()) {
            const Bytes bytes = WithoutLock(id, value.All());
            if (!SaysSomething(id, bytes)) continue;
            value = Content(bytes);
        }
        values[{Aspect::kEntry, NameOfEntry(id)}] = std::move(value);
    }
    for (const Metadata::ServiceFile& file : metadata.services) {
        values[{Aspect::kService, file.name}] = file.value;
    }
    return values;
}

class Comparison {
 public:
    Comparison(const Object& original, const Object& copy, const Compared& compared,
               const ComparisonReceiver& receiver)
        : original_(AsReadable(original)),
          copy_(AsReadable(copy)),
          compared_(compared),
          receiver_(receiver) {}

    void Run() {
        const struct stat info = StatusOf(original_.place);
        const struct stat there = StatusOf(copy_.place);
        if ((info.st_mode & S_IFMT) != (there.st_mode & S_IFMT)) {
            return receiver_.differs({.path = original_.path(), .aspect = Aspect::kType});
        }
        // Of what a dry run would have copied all but the metadata is sure to be the same.
        const Place& copy = copy_.place;
        foreseen_ = S_ISDIR(there.st_mode) ? Foreseen::IsFinished(there)
                                           : Foreseen::Find(*copy.directory, copy.name) != nullptr;
        if (S_ISREG(info.st_mode) && compared_.data && !foreseen_) Try([&] { CompareData(); });
        if (S_ISLNK(info.st_mode) && !foreseen_) Try([&] { CompareTargets(); });
        if ((S_ISBLK(info.st_mode) || S_ISCHR(info.st_mode)) && info.st_rdev != there.st_rdev) {
            receiver_.differs({.path = original_.path(), .aspect = Aspect::kTarget});
        }
        Try([&] { CompareMetadata(); });
    }

 private:
    template <class Work>
    void Try(Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            receiver_.fails(failure);
        }
    }

    static std::shared_ptr<const File> OpenData(const Object& object) {
        if (auto file = object.place.directory->FindFile(object.place.name, O_RDONLY)) return file;
        throw SystemFailure(object.path(), ENOENT);
    }

    void CompareData() {
        constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;
        const auto original = OpenData(original_);
        const auto copy = OpenData(copy_);
        for (std::uint64_t at = 0;; at += kPiece) {
            if (receiver_.give_up()) {
                throw Failure(kFailed, original_.path(), "it was not compared to its end",
                              "compare again with: mavoea diff --data");
            }
            const Content piece(original->Read(at, kPiece));
            if (const auto offset = FirstDifference(piece, Content(copy->Read(at, kPiece)))) {
                return receiver_.differs(
                    {.path = original_.path(), .aspect = Aspect::kData, .offset = at + *offset});
            }
            if (piece.size() < kPiece) return;
        }
    }

    void CompareTargets() {
        const auto target_of = [](const Object& object) {
            Bytes target(PATH_MAX);
            const ssize_t size =
                ::readlinkat(object.place.directory->fd(), object.place.name.c_str(),
                             reinterpret_cast<char*>(target.data()), target.size());
            if (size < 0) throw SystemFailure(object.path(), errno);
            target.resize(static_cast<std::size_t>(size));
            return Content(std::move(target));
        };
        if (const auto offset = FirstDifference(target_of(original_), target_of(copy_))) {
            receiver_.differs(
                {.path = original_.path(), .aspect = Aspect::kTarget, .offset = offset});
        }
    }

    void CompareMetadata() {
        Metadata wanted = ReadMetadata(original_, Sidecars::Services::kFind);
        Metadata found =
            foreseen_ ? WhatWouldArrive(wanted) : ReadMetadata(copy_, Sidecars::Services::kFind);
        if (original_.dialect() != nullptr || copy_.dialect() != nullptr) {
            TakeMarksFromWord(&wanted);
            TakeMarksFromWord(&found);
        }
        for (const Metadata* one : {&wanted, &found}) {
            for (const Failure& problem : one->problems) receiver_.fails(problem);
        }
        const Values original = ValuesOf(wanted);
        const Values copy = ValuesOf(found);
        std::set<Key> keys;
        for (const Values* values : {&original, &copy}) {
            for (const auto& [key, value] : *values) keys.insert(key);
        }
        const bool in_inode = KeepsInInode(original_) || KeepsInInode(copy_);
        // What cannot be read has been told, and may hold what seems not to be there.
        const bool original_is_known = wanted.problems.empty();
        const bool copy_is_known = found.problems.empty();
        for (const Key& key : keys) {
            const auto value = original.find(key);
            const auto there = copy.find(key);
            Difference difference = {
                .path = original_.path(), .aspect = key.aspect, .name = key.name};
            if (there == copy.end()) {
                if (!copy_is_known) continue;
                if (!compared_.copied && in_inode && InodeHas(copy_, original_, *value)) continue;
                difference.what = What::kMissing;
            } else if (value == original.end()) {
                if (!original_is_known) continue;
                // An attribute that the original has as every file may have some.
                if (in_inode && InodeHas(original_, copy_, *there)) continue;
                // A directory that was there was made when it was.
                if (compared_.copied && key.name == kCreated) continue;
                difference.what = What::kExtra;
            } else if (value->second.damaged() || there->second.damaged()) {
                continue;  // told as what cannot be read
            } else {
                if (key == Key{Aspect::kEntry, NameOfEntry(EntryId::kFileDates)} &&
                    SaysAll(EntryId::kFileDates, there->second.All(), value->second.All())) {
                    continue;
                }
                difference.offset = FirstDifference(value->second, there->second);
                if (!difference.offset) continue;
            }
            receiver_.differs(std::move(difference));
        }
        CompareStrays(wanted, found);
    }

    Metadata WhatWouldArrive(const Metadata& wanted) const {
        std::vector<Missing> missing;
        const Writer& writer = WriterFor(copy_);
        Metadata arrives = writer.Fit(wanted, copy_, &missing);
        try {
            const auto inode = Inode::Open(copy_.place);
            RemoveItems(writer.Write(copy_, *inode, arrives, {}).missing, &arrives);
        } catch (const Failure&) {  // it would be there with what lies there already
            return ReadMetadata(copy_, Sidecars::Services::kFind);
        }
        arrives.strays.clear();
        arrives.problems.clear();
        const Sidecars beside = Sidecars::Find(copy_, Sidecars::Services::kLeaveOut);
        if (beside.problem) arrives.problems.push_back(*beside.problem);
        return arrives;
    }

    // What lies beside the original, and has no place in what is compared.
    void CompareStrays(const Metadata& wanted, const Metadata& found) {
        const auto name_of = [](const Metadata::Stray& stray) {
            return stray.holder.substr(stray.holder.rfind('/') + 1) + '\n' + stray.reason;
        };
        std::multiset<std::string> there;
        for (const Metadata::Stray& stray : found.strays) there.insert(name_of(stray));
        for (const Metadata::Stray& stray : wanted.strays) {
            if (const auto same = there.find(name_of(stray)); same != there.end()) {
                there.erase(same);
                continue;
            }
            receiver_.differs({.path = original_.path(),
                               .aspect = Aspect::kService,
                               .what = What::kMissing,
                               .name = stray.item});
        }
    }

    static bool KeepsInInode(const Object& object) {
        return object.keeping() == Keeping::kXattr || object.dialect() != nullptr;
    }

    // Whether an object has itself what is metadata of the other one, under the name that it has
    // there.
    static bool InodeHas(const Object& object, const Object& other,
                         const Values::value_type& item) {
        if (item.first.aspect != Aspect::kAttribute) return false;
        const auto inode = Inode::Open(object.place);
        if (!inode->HoldsContents()) return false;
        const std::string& name = item.first.name;
        std::optional<Bytes> own = inode->Attribute(name);
        if (const Dialect* const dialect = other.dialect()) {
            const auto spelling = SpellAttribute(name, *dialect);
            own = spelling ? spelling->Value(*inode) : std::nullopt;
        }
        return own && *own == item.second.All();
    }

    const Object original_;
    const Object copy_;
    const Compared& compared_;
    const ComparisonReceiver& receiver_;
    bool foreseen_ = false;  // the copy has not been made
};

}  // namespace

std::string ItemText(const Difference& difference) {
    switch (difference.aspect) {
        case Aspect::kObject:
            return {};
        case Aspect::kAttribute:
            return '"' + Printable(difference.name) + '"';
        case Aspect::kEntry:
            return "AppleDouble " + difference.name;
        case Aspect::kService:
            return "of another service, \"" + Printable(difference.name) + '"';
        case Aspect::kType:
        case Aspect::kData:
        case Aspect::kTarget:
            break;
    }
    return WordOf(difference.aspect);
}

std::string DifferenceText(const Difference& difference) {
    std::string text = Printable(difference.path) + ": ";
    if (const std::string item = ItemText(difference); !item.empty()) text += item + ": ";
    text += WordOf(difference.what);
    if (difference.offset) text += " at byte " + std::to_string(*difference.offset);
    return text;
}

Json DifferenceJson(const Difference& difference) {
    Json json;
    if (!difference.path.empty()) json.SetText("path", difference.path);
    json.Set("aspect", WordOf(difference.aspect));
    if (!difference.name.empty()) json.SetText("name", difference.name);
    json.Set("what", WordOf(difference.what));
    if (difference.offset) json.Set("offset", *difference.offset);
    return json;
}

void Compare(const Object& first, const Object& second, const Compared& compared,
             const ComparisonReceiver& receiver) {
    Comparison(first, second, compared, receiver).Run();
}

}  // namespace mavoea::tool

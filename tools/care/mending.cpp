#include "tools/care/mending.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <utility>

#include "format/samba_stream.h"
#include "include/mavoea.h"
#include "tools/care/check_directory.h"
#include "tools/care/check_object.h"
#include "tools/care/kept.h"
#include "tools/care/repair.h"
#include "tools/care/strays.h"
#include "tools/care/whole_file.h"
#include "tools/place/dry_run.h"
#include "tools/say/text.h"
#include "tools/store/acceptance.h"
#include "tools/store/adoption.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/locking.h"
#include "tools/store/rights.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

constexpr const char* kGiveAgain = "give the command again";

// Which of the ways below mends a kind; those of an object in the order in which they are gone.
enum class Way { kNone, kAnew, kRights, kNul, kUpgrade, kRepair, kStray, kCopy, kSettle, kEmpty };

struct KindMending {
    FindingKind kind;
    Way way;
    const char* how;  // or why not
};
constexpr KindMending kMendings[] = {
    {FindingKind::kDamagedStream, Way::kAnew,
     "written anew where every part of it can be read; the old one is kept"},
    {FindingKind::kDamagedAppleDouble, Way::kAnew, "the same"},
    {FindingKind::kDamagedResourceFile, Way::kAnew, "the same"},
    {FindingKind::kDamagedRecord, Way::kNone,
     "left: what of it is right cannot be told; let the AFP service write it anew"},
    {FindingKind::kDamagedAttribute, Way::kNone, "left: what is missing is nowhere; set it anew"},
    {FindingKind::kNoFile, Way::kNone, "left: see who put it there, and remove it"},
    {FindingKind::kOtherRights, Way::kRights, "its object's rights, if it is sound"},
    {FindingKind::kDanglingMetadata, Way::kNone,
     "left: mavoea clean removes it, and nothing else has it"},
    {FindingKind::kDanglingServiceFile, Way::kNone, "left: mavoea clean --all removes it"},
    {FindingKind::kEmptyEaDirectory, Way::kEmpty, "removed"},
    {FindingKind::kSharedNames, Way::kNone, "left: give one of the two a shorter name"},
    {FindingKind::kEarlierLayout, Way::kUpgrade, "as mavoea upgrade does it"},
    {FindingKind::kStrandedMetadata, Way::kStray,
     "what nobody has is put in its place; with --yes the file goes, unless it differs"},
    {FindingKind::kMisplacedMetadata, Way::kStray, "the same"},
    {FindingKind::kMisplacedAttributes, Way::kRepair,
     "as mavoea repair does it; the old files are kept"},
    {FindingKind::kLeftTemporaryFile, Way::kSettle, "removed, if no process works with it"},
    {FindingKind::kUnfinishedRename, Way::kSettle, "brought to its end, or taken back"},
    {FindingKind::kUnfinishedMove, Way::kNone, "left: give the same mavoea mv again"},
    {FindingKind::kUnfinishedRepair, Way::kCopy,
     "with --yes removed, if the resource file itself is sound"},
    {FindingKind::kDifferingValues, Way::kNone, "left: decide which is right, and set it"},
    {FindingKind::kSmbdIgnoresFile, Way::kAnew, "written anew, as for damage"},
    {FindingKind::kSmbdOverridesFinderInfo, Way::kNone,
     "left: whose Finder info is right only a person can tell"},
    {FindingKind::kSmbdRefusesRecord, Way::kNone,
     "left: save it with getfattr, and set Finder info and comment anew"},
    {FindingKind::kSmbdCutsValue, Way::kNul, "a NUL is put behind it"},
    {FindingKind::kMacIgnoresFile, Way::kAnew, "written anew, as for damage"},
    {FindingKind::kUndeclaredMetadata, Way::kNone, "left: declare the type of the volume"},
};
static_assert(std::size(kMendings) == kFindingKinds);

constexpr bool AreInOrder() {
    for (std::size_t i = 0; i < std::size(kMendings); ++i) {
        if (static_cast<std::size_t>(kMendings[i].kind) != i) return false;
    }
    return true;
}
static_assert(AreInOrder());

Way WayOf(FindingKind kind) { return kMendings[static_cast<std::size_t>(kind)].way; }

// Why a kind without a way is left.
std::string WhyLeft(FindingKind kind) {
    constexpr std::string_view kLeft = "left: ";
    const std::string_view how = HowMended(kind);
    return std::string(how.starts_with(kLeft) ? how.substr(kLeft.size()) : how);
}

bool IsDamage(const Finding& finding) {
    return finding.kind == FindingKind::kDamagedStream ||
           finding.kind == FindingKind::kDamagedAppleDouble ||
           finding.kind == FindingKind::kDamagedResourceFile;
}

// Everything that a check finds.
class Collector final : public FindingSink {
 public:
    void Add(const Finding& finding) override { findings.push_back(finding); }
    void AddFailure(const Failure& failure) override { failures.push_back(failure); }
    void AddKept(const std::string&, const std::string&) override {}

    std::vector<Finding> findings;
    std::vector<Failure> failures;
};

// What tells two findings apart; of a damaged file there may be any number of one key.
using Key = std::pair<FindingKind, std::string>;
Key KeyOf(const Finding& finding) {
    return {finding.kind,
            (finding.file.empty() ? finding.path : finding.file) +
                (finding.kind == FindingKind::kSmbdCutsValue ? finding.attribute : std::string())};
}

// What was done about findings, and what a second look has found.
class Account {
 public:
    void SetKept(const Finding& finding, const std::string& path) { kept_[KeyOf(finding)] = path; }
    void SetWhy(const Finding& finding, const std::string& why) { why_[KeyOf(finding)] = why; }
    void SetReadable(const Finding& finding, const std::string& readable) {
        readable_[KeyOf(finding)] = readable;
    }

    // That a second look in a dry run finds it still says nothing.
    void SetForeseen(const Finding& finding) { foreseen_.insert(KeyOf(finding)); }

    bool HasKept(const std::string& path) const {
        return std::any_of(kept_.begin(), kept_.end(),
                           [&](const auto& one) { return one.second == path; });
    }

    void Say(const std::vector<Finding>& before, const std::vector<Finding>& after, bool looked,
             MendingSink* sink) const {
        std::set<Key> left;
        for (const Finding& finding : after) {
            if (!IsForeseen(finding)) left.insert(KeyOf(finding));
        }
        std::set<Key> said;
        for (const Finding& finding : before) {
            const bool fixed =
                looked && WayOf(finding.kind) != Way::kNone && !left.contains(KeyOf(finding));
            said.insert(KeyOf(finding));
            sink->AddMended(finding, fixed ? Done(finding) : Left(finding));
        }
        for (const Finding& finding : after) {
            const bool can_be_new = WayOf(finding.kind) != Way::kNone || IsDamage(finding);
            if (can_be_new && !said.contains(KeyOf(finding))) {
                sink->AddMended(finding, Left(finding));
            }
        }
    }

 private:
    template <class Map>
    static std::string In(const Map& map, const Finding& finding) {
        const auto found = map.find(KeyOf(finding));
        return found == map.end() ? std::string() : found->second;
    }
    bool IsForeseen(const Finding& finding) const {
        return foreseen_.contains(KeyOf(finding)) && !why_.contains(KeyOf(finding));
    }
    Mended Done(const Finding& finding) const { return {.done = true, .kept = In(kept_, finding)}; }
    Mended Left(const Finding& finding) const {
        std::string why = In(why_, finding);
        if (why.empty()) {
            why = WayOf(finding.kind) == Way::kNone ? WhyLeft(finding.kind)
                                                    : "it is there still; look at it";
        }
        return {.kept = In(kept_, finding), .why = why, .readable = In(readable_, finding)};
    }

    std::map<Key, std::string> kept_;
    std::map<Key, std::string> why_;
    std::map<Key, std::string> readable_;
    std::set<Key> foreseen_;
};

WhyIgnored WhyIgnoredBy(FindingKind kind) {
    return kind == FindingKind::kSmbdIgnoresFile  ? WhySmbdIgnores
           : kind == FindingKind::kMacIgnoresFile ? WhyMacIgnores
                                                  : nullptr;
}

// ---- Rights -------------------------------------------------------------------------------------

void MendRights(const Object& object, const Place& place) {
    const auto inode = Inode::Open(object.place);
    const auto file = place.directory->FindFile(place.name, O_RDONLY);
    if (!file) return;
    LockFile(*file, Access::kRead);
    const struct stat info = file->Status();
    if (info.st_nlink > 1) {
        throw Failure(kFailed, place.path(), "it has several names, all of which would change",
                      "see where they are");
    }
    if (!CheckLayout(ReadLayout(*file)).violations.empty()) {
        throw Failure(kFailed, place.path(), "it is damaged: whose it is cannot be told",
                      "mend that first");
    }
    RequireShared(*inode, *file);
    if (info.st_uid != inode->info().st_uid && ::geteuid() != 0) {
        throw Failure(kFailed, place.path(), "only the superuser may give it to the object's owner",
                      "give the command as root");
    }
    if (DryRun()) {
        if (const int error = WhyNoWriting(place)) throw SystemFailure(place.path(), error);
        return;
    }
    Rights::Of(*inode).GiveAgain(*file);
}

// ---- Streams of Samba's -------------------------------------------------------------------------

void AddNul(const Object& object, const std::string& name) {
    const auto inode = Inode::Open(object.place);
    auto value = inode->Attribute(name);
    const auto decoded = value ? DecodeStreamValue(*value) : std::nullopt;
    if (!decoded || decoded->extents == 0) return;
    constexpr unsigned kMostParts = 16;
    if (decoded->extents <= kMostParts) {
        throw Failure(kFailed, object.path(),
                      "its last byte may be the number of its parts, of which none is there",
                      "mavoea get what is needed, and set it again");
    }
    value->push_back(0);
    inode->SetAttribute(name, *value);
    const auto again = inode->Attribute(name);
    if (again != value) {
        throw Failure(kFailed, object.path(), "somebody has changed it meanwhile", kGiveAgain);
    }
    inode->Sync();
}

// ---- Objects ------------------------------------------------------------------------------------

class ObjectMending {
 public:
    ObjectMending(const Object& object, Replaced replaced, MendingSink* sink)
        : object_(object), replaced_(replaced), sink_(*sink) {}

    void Run() {
        const Collector first = Look();
        if (!first.failures.empty()) return GiveUp(first);
        sound_ = std::none_of(first.findings.begin(), first.findings.end(), IsDamage);
        // An earlier repair's would be in the way of what is to be kept now.
        if (replaced_ == Replaced::kRemoved && !first.findings.empty() && sound_) LookAtKept();
        if (!first.findings.empty()) {
            if (WritesAnything(first)) Mend(first.findings);
            const Collector last = Look();
            for (const Failure& failure : last.failures) sink_.AddFailure(failure);
            account_.Say(first.findings, last.findings, last.failures.empty(), &sink_);
            if (!last.failures.empty()) return;
            sound_ = std::none_of(last.findings.begin(), last.findings.end(), IsDamage);
        }
        LookAtKept();
    }

 private:
    Collector Look() const {
        Collector found;
        try {
            ObjectCheck(&found).Run(object_);
        } catch (const Failure& failure) {
            found.failures.push_back(failure);
        }
        return found;
    }

    // Nothing is done about an object of which something could not be looked at.
    void GiveUp(const Collector& found) {
        for (const Finding& finding : found.findings) {
            account_.SetWhy(finding, "not all of the object could be looked at");
        }
        for (const Failure& failure : found.failures) sink_.AddFailure(failure);
        account_.Say(found.findings, {}, false, &sink_);
    }

    static bool WritesAnything(const Collector& found) {
        return std::any_of(found.findings.begin(), found.findings.end(),
                           [](const Finding& one) { return WayOf(one.kind) != Way::kNone; });
    }

    void Mend(const std::vector<Finding>& findings) {
        for (const Finding& finding : findings) {
            if (WayOf(finding.kind) != Way::kAnew) continue;
            const std::string file = finding.file.empty() ? finding.path : finding.file;
            Guard(finding, [&] { WriteFileAnew(finding, file); });
        }
        // What takes all of an object takes a sound one.
        const bool damaged = IsDamaged();
        for (const Way way :
             {Way::kNul, Way::kUpgrade, Way::kRepair, Way::kStray, Way::kCopy, Way::kRights}) {
            for (const Finding& finding : findings) {
                if (WayOf(finding.kind) != way) continue;
                if (damaged && way != Way::kNul && way != Way::kRights) {
                    account_.SetWhy(finding, "what is damaged has to be mended first");
                    continue;
                }
                Guard(finding, [&] { MendBy(way, finding); });
            }
        }
    }

    bool IsDamaged() const {
        const Collector now = Look();
        return !now.failures.empty() ||
               std::any_of(now.findings.begin(), now.findings.end(), IsDamage);
    }

    template <class Work>
    void Guard(const Finding& finding, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            account_.SetWhy(finding, failure.cause());
        }
    }

    void MendBy(Way way, const Finding& finding) {
        // What the library would do, and what would go, cannot be looked at.
        if (DryRun() && way != Way::kNul) account_.SetForeseen(finding);
        switch (way) {
            case Way::kRights:
                if (const auto own = OwnFile(finding.file)) MendRights(object_, own->file);
                return;
            case Way::kNul:
                return AddNul(object_, finding.attribute);
            case Way::kUpgrade:
                (void)Adopt(object_);
                return;
            case Way::kRepair:
                return MendResource(finding);
            case Way::kStray:
                return MendStray(finding);
            case Way::kCopy:
                return RemoveCopy();
            default:
                return;
        }
    }

    // The stream, resource file or "._" file of that path.
    std::optional<FileOfObject> OwnFile(const std::string& path) const {
        const Directory& beside = *object_.place.directory;
        const std::string apple_double = AppleDoubleName(object_.place.name);
        if (!apple_double.empty() && beside.PathOf(apple_double) == path) {
            return FileOfObject{{object_.place.directory, apple_double}, KeptOf::kAppleDouble};
        }
        const DirectoryRef in = beside.FindAgain(kEaDirName);
        if (!in) return std::nullopt;
        const std::string derived = NameInEaDirectory(object_.place.name);
        const std::string stream = derived + "@" MAVOEA_KIND_STREAM;
        const std::string resource = derived + "@" MAVOEA_KIND_RESOURCE;
        if (in->PathOf(stream) == path) return FileOfObject{{in, stream}, KeptOf::kStream};
        if (in->PathOf(resource) == path) return FileOfObject{{in, resource}, KeptOf::kResource};
        return std::nullopt;
    }

    // Once for all findings of a file.
    void WriteFileAnew(const Finding& finding, const std::string& path) {
        auto known = anew_.find(path);
        if (known == anew_.end()) {
            known = anew_.emplace(path, TryToWriteAnew(finding.kind, path)).first;
        }
        const Mended& result = known->second;
        if (!result.why.empty()) account_.SetWhy(finding, result.why);
        if (!result.kept.empty()) account_.SetKept(finding, result.kept);
        if (!result.readable.empty()) account_.SetReadable(finding, result.readable);
    }

    Mended TryToWriteAnew(FindingKind kind, const std::string& path) const {
        Mended result;
        const auto own = OwnFile(path);
        if (!own) {
            result.why = "files of earlier layouts are not written anew";
            const auto legacy =
                Sidecars::Find(object_, Sidecars::Services::kLeaveOut).legacy_resource;
            if (!legacy || legacy->path() != path) return result;
            const auto file = legacy->directory->FindFile(legacy->name, O_RDONLY);
            if (file) result.readable = WhatCanBeRead(file);
            return result;
        }
        try {
            result.kept = WriteAnew(object_, *own, WhyIgnoredBy(kind));
        } catch (const Failure& failure) {
            result.why = failure.cause();
            const auto file = own->file.directory->FindFile(own->file.name, O_RDONLY);
            if (file) result.readable = WhatCanBeRead(file);
        }
        return result;
    }

    void MendResource(const Finding& finding) {
        const Rights rights = Rights::Of(*Inode::Open(object_.place));
        const DirectoryRef in = object_.place.directory->FindAgain(kEaDirName);
        if (!in) return;
        const auto stream =
            OwnFile(in->PathOf(NameInEaDirectory(object_.place.name) + "@" MAVOEA_KIND_STREAM));
        for (const auto& own : {stream, OwnFile(finding.file)}) {
            if (!own || !own->file.Status()) continue;
            // Of one that has been written anew just now the old one is kept.
            const auto anew = anew_.find(own->file.path());
            if (anew != anew_.end() && !anew->second.kept.empty()) continue;
            const auto file = OpenOwn(object_, own->file);
            if (!file) continue;
            const Place kept = {own->file.directory, KeptName(object_.place.name, own->which)};
            account_.SetKept(finding, KeepOnce(*file, kept, rights));
        }
        (void)RepairObject(object_);
    }

    // A run that was killed may have kept what was there before it, and written the file already.
    std::string KeepOnce(const File& file, const Place& kept, const Rights& rights) const {
        const auto before = kept.Status() ? OpenOwn(object_, kept) : nullptr;
        if (!before) return Keep(file, kept, rights);
        RequireAllOf(object_, ReadWhole(before));
        return kept.path();
    }

    void MendStray(const Finding& finding) {
        if (!AdoptStray(object_, finding.file)) return;
        if (replaced_ == Replaced::kRemoved) {
            if (!DryRun()) RemoveStray(object_, finding.file);
            return;
        }
        account_.SetWhy(finding, "all of it is in its place now; --yes removes the file");
    }

    void RemoveCopy() {
        const Sidecars sidecars = Sidecars::Find(object_, Sidecars::Services::kLeaveOut);
        if (!sidecars.resource_copy) return;
        if (!sidecars.resource) {
            throw Failure(kFailed, sidecars.resource_copy->path(),
                          "the resource file that it is a copy of is not there", "look at it");
        }
        if (replaced_ == Replaced::kKept) {
            throw Failure(kFailed, sidecars.resource_copy->path(),
                          "the resource file is sound; --yes removes the copy", "give --yes");
        }
        const auto& copy = *sidecars.resource_copy;
        if (!OpenOwn(object_, {copy.directory, copy.name})) return;
        RemoveFiles({copy});
    }

    // ---- What has been kept ---------------------------------------------------------------------

    void LookAtKept() {
        try {
            for (const Place& kept : FindKept(object_)) LookAtKept(kept);
        } catch (const Failure& failure) {
            sink_.AddFailure(failure);
        }
    }

    void LookAtKept(const Place& kept) {
        if (replaced_ == Replaced::kKept) {
            if (!account_.HasKept(kept.path())) sink_.AddKept(object_.path(), kept.path());
            return;
        }
        std::string why;
        try {
            if (!sound_) {
                why = "the object's metadata is damaged";
            } else {
                RemoveKept(kept);
            }
        } catch (const Failure& failure) {
            why = failure.cause();
        }
        sink_.AddRemoved(object_.path(), kept.path(), why);
    }

    void RemoveKept(const Place& kept) const {
        const auto file = OpenOwn(object_, kept);
        if (!file) return;
        RequireAllOf(object_, ReadWhole(file));
        // What has been compared is on disk before anything goes.
        kept.directory->SyncVolume();
        RemoveFiles({{kept.directory, kept.name, file->Status()}});
        kept.directory->Sync();
    }

    const Object& object_;
    const Replaced replaced_;
    MendingSink& sink_;
    Account account_;
    std::map<std::string, Mended> anew_;  // files that were to be written
    bool sound_ = true;
};

}  // namespace

const char* HowMended(FindingKind kind) { return kMendings[static_cast<std::size_t>(kind)].how; }

std::string MendingText() {
    std::size_t width = 0;
    for (const KindMending& one : kMendings) {
        width = std::max(width, std::string_view(CodeOf(one.kind)).size());
    }
    std::string text = "With --repair:\n";
    for (const KindMending& one : kMendings) {
        std::string code = CodeOf(one.kind);
        code.resize(width + 2, ' ');
        text += "  " + code + one.how + '\n';
    }
    return text;
}

void MendObject(const Object& object, Replaced replaced, MendingSink* sink) {
    ObjectMending(object, replaced, sink).Run();
    if (!DryRun()) return;
    // Each object is looked at by itself, and takes descriptors.
    Foreseen::ForgetAll();
    Rehearsed::Forget();
}

void MendDirectory(const DirectoryRef& directory, MendingSink* sink) {
    Account account;
    Collector before;
    CheckDirectory(directory, &before);
    const auto has = [&](Way way) {
        return std::any_of(before.findings.begin(), before.findings.end(),
                           [&](const Finding& one) { return WayOf(one.kind) == way; });
    };
    const auto mend = [&](Way way, auto work) {
        if (!has(way)) return;
        const auto each = [&](const auto& note) {
            for (const Finding& one : before.findings) {
                if (WayOf(one.kind) == way) note(one);
            }
        };
        try {
            work();
            if (DryRun()) each([&](const Finding& one) { account.SetForeseen(one); });
        } catch (const Failure& failure) {
            each([&](const Finding& one) { account.SetWhy(one, failure.cause()); });
        }
    };
    mend(Way::kSettle, [&] { (void)SettlePending(directory); });
    mend(Way::kEmpty, [&] { RemoveEaDirectoryIfEmpty(*directory); });
    for (const Finding& one : before.findings) {  // of an object that is gone
        if (WayOf(one.kind) == Way::kCopy) account.SetWhy(one, "mavoea clean removes it");
    }
    directory->ForgetEntries();
    directory->Forget(kEaDirName);
    Collector after;
    CheckDirectory(directory, &after);
    account.Say(before.findings, after.findings, true, sink);
    for (const Place& kept : FindKeptOfNobody(directory)) sink->AddKept({}, kept.path());
}

}  // namespace mavoea::tool

#include "tools/transfer/pending.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <map>
#include <random>

#include "tools/place/dry_run.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"
#include "util/fnv.h"

namespace mavoea::tool {
namespace {

constexpr std::size_t kMarkDigits = 16;

struct PartName {
    Pending::Part part;
    const char* name;
};
constexpr PartName kPartNames[] = {
    {Pending::Part::kMoved, "moved"},
    {Pending::Part::kReplaced, "replaced"},
    {Pending::Part::kDropped, "dropped"},
};

const char* NameOf(Pending::Part part) {
    for (const PartName& one : kPartNames) {
        if (one.part == part) return one.name;
    }
    return "";
}

std::optional<std::uint64_t> FromHex(std::string_view digits) {
    std::uint64_t value = 0;
    const auto [end, error] =
        std::from_chars(digits.data(), digits.data() + digits.size(), value, 16);
    if (error != std::errc() || end != digits.data() + digits.size()) return std::nullopt;
    return value;
}

std::string ToHex(std::uint64_t value, std::size_t least) {
    std::array<char, 16> digits{};
    const auto [end, error] = std::to_chars(digits.begin(), digits.end(), value, 16);
    const std::string text(digits.begin(), end);
    return std::string(least - std::min(least, text.size()), '0') + text;
}

Failure Busy(const std::string& path) {
    return {kFailed, path, "another process is just renaming it", "try again"};
}

DirectoryRef FindEaDirectory(const Directory& directory) {
    const auto info = directory.StatusOf(kEaDirName);
    return info && S_ISDIR(info->st_mode) ? directory.FindAgain(kEaDirName) : nullptr;
}

}  // namespace

// ---- Its name -----------------------------------------------------------------------------------

namespace {

std::uint32_t Folded(std::uint64_t hash) { return static_cast<std::uint32_t>(hash ^ hash >> 32); }

std::uint32_t HashOf(const std::string& name) { return Folded(Fnv::Of(name)); }

}  // namespace

PendingOwner PendingOwner::Of(const std::string& name, ino_t inode, std::uint64_t birth,
                              nlink_t links) {
    Fnv hash;
    for (; links > 0; links >>= 8) hash.Add(static_cast<std::uint8_t>(links));
    hash.AddNumber(birth);
    return {inode, (std::uint64_t{HashOf(name)} << 32) | Folded(hash.value())};
}

bool PendingOwner::IsCalled(const std::string& name) const { return HashOf(name) == mark >> 32; }

std::optional<PendingOwner> PendingOwner::Parse(std::string_view name) {
    if (!name.starts_with(kOwnPrefix)) return std::nullopt;
    name.remove_prefix(kOwnPrefix.size());
    const std::size_t dash = name.find('-');
    if (dash == std::string_view::npos || name.size() - dash - 1 != kMarkDigits) {
        return std::nullopt;
    }
    const auto inode = FromHex(name.substr(0, dash));
    const auto mark = FromHex(name.substr(dash + 1));
    if (!inode || !mark) return std::nullopt;
    return PendingOwner{static_cast<ino_t>(*inode), *mark};
}

PendingOwner PendingOwner::Nobody() {
    static std::random_device random;
    return {0, (std::uint64_t{random()} << 32) | random()};
}

std::string PendingOwner::Name() const {
    return std::string(kOwnPrefix) + ToHex(inode, 1) + '-' + ToHex(mark, kMarkDigits);
}

bool PendingOwner::IsAt(const Place& place) const {
    const auto info = place.Status();
    if (!info || info->st_ino != inode || !IsCalled(place.name)) return false;
    const std::uint64_t birth = BirthOf(place);
    return Of(place.name, inode, birth) == *this ||
           Of(place.name, inode, birth, info->st_nlink) == *this;
}

// ---- The directory ------------------------------------------------------------------------------

std::unique_ptr<Pending> Pending::Make(const DirectoryRef& holder, const PendingOwner& owner) {
    constexpr int kAttempts = 100;
    const std::string name = owner.Name();
    for (int attempt = 1; attempt <= kAttempts; ++attempt) {
        if (::mkdirat(holder->fd(), name.c_str(), S_IRWXU) != 0) {
            if (errno == ENOSPC || errno == EDQUOT) return nullptr;
            if (errno == EEXIST) throw Busy(holder->PathOf(name));
            throw SystemFailure(holder->PathOf(name), errno);
        }
        bool busy = false;
        DirectoryRef made = holder->LockIn(name, &busy);
        // Before it was locked somebody may have taken it for one that is left over.
        if (made && made->Status().st_nlink > 0) {
            return std::unique_ptr<Pending>(new Pending(holder, std::move(made), owner));
        }
    }
    throw Busy(holder->PathOf(name));
}

std::unique_ptr<Pending> Pending::Find(const DirectoryRef& holder, const PendingOwner& owner,
                                       bool* busy) {
    DirectoryRef found = holder->LockIn(owner.Name(), busy);
    if (!found) return nullptr;
    return std::unique_ptr<Pending>(new Pending(holder, std::move(found), owner));
}

bool Pending::TryToLink(const Place& file, const std::string& new_name) const {
    return ::linkat(file.directory->fd(), file.name.c_str(), directory_->fd(), new_name.c_str(),
                    0) == 0;
}

void Pending::Move(Part part, const Place& from, const std::string& new_name) {
    from.directory->Rename(from.name, *DirectoryOf(part), new_name);
}

const DirectoryRef& Pending::DirectoryOf(Part part) {
    if (part == Part::kSecondNames) return directory_;
    for (const auto& [known, directory] : parts_) {
        if (known == part) return directory;
    }
    const std::string name = NameOf(part);
    if (::mkdirat(directory_->fd(), name.c_str(), S_IRWXU) != 0 && errno != EEXIST) {
        throw SystemFailure(directory_->PathOf(name), errno);
    }
    return parts_.emplace_back(part, directory_->OpenIn(name)).second;
}

std::vector<Pending::Entry> Pending::Entries() const {
    std::vector<Entry> entries;
    for (const Directory::Entry& entry : directory_->Entries()) {
        const auto* const part =
            std::find_if(std::begin(kPartNames), std::end(kPartNames),
                         [&](const PartName& one) { return entry.name == one.name; });
        if (part == std::end(kPartNames)) {
            entries.push_back({directory_, entry.name, Part::kSecondNames});
            continue;
        }
        const DirectoryRef in = directory_->OpenIn(entry.name);
        for (const Directory::Entry& inner : in->Entries()) {
            entries.push_back({in, inner.name, part->part});
        }
    }
    return entries;
}

void Pending::Clear() const {
    for (const Entry& entry : Entries()) (void)entry.in->Remove(entry.name);
}

void Pending::Clear(Part part) {
    const bool made = std::any_of(parts_.begin(), parts_.end(),
                                  [part](const auto& known) { return known.first == part; });
    if (!made) return;
    const DirectoryRef& in = DirectoryOf(part);
    for (const Directory::Entry& entry : in->Entries()) (void)in->Remove(entry.name);
}

bool Pending::Remove() const {
    const std::string name = owner_.Name();
    if (holder_->RemoveEmpty(name)) return true;
    for (const PartName& part : kPartNames) (void)directory_->RemoveEmpty(part.name);
    return holder_->RemoveEmpty(name) || !holder_->Has(name);
}

// ---- What was cut short -------------------------------------------------------------------------

namespace {

using Part = Pending::Part;

// What becomes of things whose object is not there, and which may have no other name: who has only
// passed by leaves them, who has waited and looked twice removes them. What was moved stays in any
// case.
enum class Unowned { kKept, kRemoved };

// One pending directory of those that were left.
class Settling {
 public:
    Settling(const DirectoryRef& directory, Pending* pending, Unowned unowned)
        : directory_(directory), pending_(*pending), unowned_(unowned) {}

    // Whether nothing is left of it.
    bool Run() {
        const std::vector<Pending::Entry> entries = pending_.Entries();
        if (pending_.owner().inode == 0) return GiveBack(entries);
        std::optional<std::string> object = FindObject(entries);
        if (!object) object = PutObject(entries);
        for (const Pending::Entry& entry : entries) {
            if (!entry.in->Has(entry.name)) continue;
            if (object && entry.part != Part::kDropped) {
                if (IsOf(*object, entry.name)) Put(entry);
            } else if (MayGo(entry)) {
                (void)entry.in->Remove(entry.name);
            }
        }
        if (object && !beside()) RemoveOldNames(*object);
        return pending_.Remove();
    }

 private:
    // Of a rename within one directory the old names are here. Those of services' files would stay
    // otherwise: nobody but who renames knows that they are second ones.
    void RemoveOldNames(const std::string& object) const {
        const Directory& in = *pending_.holder();
        std::map<ino_t, std::vector<std::string>> names;  // of files with several
        for (const Directory::Entry& entry : in.Entries()) {
            const auto info = S_ISREG(entry.type) ? in.StatusOf(entry.name) : std::nullopt;
            if (info && info->st_nlink > 1) names[info->st_ino].push_back(entry.name);
        }
        for (const auto& [inode, same] : names) {
            const bool own = std::any_of(same.begin(), same.end(), [&](const std::string& name) {
                return IsOf(object, name);
            });
            for (const std::string& name : same) {
                if (own && !BelongsToAnObject(*directory_, name)) (void)in.RemoveFile(name);
            }
        }
    }

    // It is beside the objects, and not in the EA directory.
    bool beside() const { return pending_.holder() == directory_; }

    // Objects that are there, by name, to which a thing of that name could belong.
    std::vector<std::string> Candidates(const std::string& name) const {
        if (!beside()) return MayBelongTo(*directory_, name);
        std::vector<std::string> candidates;
        if (directory_->Has(name)) candidates.push_back(name);
        const std::string object = ObjectOfAppleDouble(name);
        if (!object.empty() && directory_->Has(object)) candidates.push_back(object);
        return candidates;
    }

    static std::string ObjectOfAppleDouble(const std::string& name) {
        constexpr std::size_t kPrefix = 2;
        return name.size() > kPrefix && AppleDoubleName(name.substr(kPrefix)) == name
                   ? name.substr(kPrefix)
                   : std::string();
    }

    bool IsOf(const std::string& object, const std::string& name) const {
        if (name == object) return true;
        return beside() ? name == AppleDoubleName(object)
                        : name.starts_with(NameInEaDirectory(object) + '@');
    }

    std::optional<std::string> FindObject(const std::vector<Pending::Entry>& entries) const {
        for (const Pending::Entry& entry : entries) {
            for (std::string& name : Candidates(entry.name)) {
                if (pending_.owner().IsAt({directory_, name})) return std::move(name);
            }
        }
        if (!entries.empty()) return std::nullopt;
        for (Directory::Entry& entry : directory_->Entries()) {
            if (pending_.owner().IsCalled(entry.name) &&
                pending_.owner().IsAt({directory_, entry.name})) {
                return std::move(entry.name);
            }
        }
        return std::nullopt;
    }

    // The object itself may be what is pending.
    std::optional<std::string> PutObject(const std::vector<Pending::Entry>& entries) const {
        if (!beside()) return std::nullopt;
        for (const Pending::Entry& entry : entries) {
            if (entry.part != Part::kMoved) continue;
            if (!pending_.owner().IsAt({entry.in, entry.name})) continue;
            Put(entry);
            return entry.name;
        }
        return std::nullopt;
    }

    void Put(const Pending::Entry& entry) const {
        const Directory& to = *pending_.holder();
        if (entry.in->RenameToNew(entry.name, to, entry.name)) return;
        const auto info = entry.in->StatusOf(entry.name);
        const auto there = to.StatusOf(entry.name);
        if (!info) return;
        if (!there || !SameFile(*info, *there)) {
            throw Failure(kFailed, to.PathOf(entry.name),
                          "it is in the way of what a rename that was cut short has left in " +
                              Printable(pending_.path()),
                          "see which of the two is right, and move the other away");
        }
        (void)entry.in->RemoveFile(entry.name);
    }

    // What has come to the place of something that was about to be removed takes that.
    bool GiveBack(const std::vector<Pending::Entry>& entries) const {
        for (const Pending::Entry& entry : entries) {
            if (entry.in->RenameToNew(entry.name, *pending_.holder(), entry.name)) continue;
            (void)entry.in->Remove(entry.name);
        }
        return pending_.Remove();
    }

    // Whether a thing whose object is not there goes.
    bool MayGo(const Pending::Entry& entry) const {
        if (entry.part == Part::kDropped) return true;
        if (entry.part == Part::kMoved) return false;
        if (unowned_ == Unowned::kRemoved) return true;
        if (entry.part == Part::kReplaced) return !Candidates(entry.name).empty();
        const auto info = entry.in->StatusOf(entry.name);
        return info && info->st_nlink > 1;
    }

    const DirectoryRef& directory_;
    Pending& pending_;
    Unowned unowned_;
};

bool HasReplaced(const Pending& pending) {
    const auto entries = pending.Entries();
    return std::any_of(entries.begin(), entries.end(),
                       [](const auto& entry) { return entry.part == Part::kReplaced; });
}

// Whether there was any. Those that other users have made are left to them.
bool SettleAllIn(const DirectoryRef& directory, const DirectoryRef& holder,
                 const std::optional<std::string>& name) {
    bool any = false;
    for (const Directory::Entry& entry : holder->Entries()) {
        if (!entry.name.starts_with(kOwnPrefix)) continue;
        try {
            if (IsTemporaryName(entry.name)) (void)RemoveAbandoned(*holder, entry.name);
            const auto owner = PendingOwner::Parse(entry.name);
            if (!owner || !S_ISDIR(entry.type) || (name && !owner->IsCalled(*name))) continue;
            bool busy = false;
            const auto pending = Pending::Find(holder, *owner, &busy);
            if (!pending) continue;
            // An object that has its own back has not been replaced.
            const bool back = name && owner->IsAt({directory, *name}) && HasReplaced(*pending);
            (void)Settling(directory, pending.get(), Unowned::kKept).Run();
            any = any || !back;
        } catch (const SystemFailure& failure) {
            if (failure.error() != EACCES) throw;
        }
    }
    return any;
}

}  // namespace

bool SettlePendingDirectory(const DirectoryRef& directory, const DirectoryRef& holder,
                            const PendingOwner& owner) {
    bool busy = false;
    const auto pending = Pending::Find(holder, owner, &busy);
    return !busy && (!pending || Settling(directory, pending.get(), Unowned::kRemoved).Run());
}

// An object that is pending itself has to be there before its metadata is looked at.
bool SettlePending(const DirectoryRef& directory, const std::optional<std::string>& name) {
    if (DryRun()) return false;
    bool any = SettleAllIn(directory, directory, name);
    if (const DirectoryRef ea_dir = FindEaDirectory(*directory)) {
        any = SettleAllIn(directory, ea_dir, name) || any;
        ea_dir->ForgetEntries();
    }
    return any;
}

bool SettleObject(const Place& object, const struct stat& info) {
    if (DryRun()) return false;
    const std::uint64_t birth = BirthOf(object);
    bool any = false;
    for (const nlink_t links : {nlink_t{0}, info.st_nlink}) {
        const PendingOwner owner = PendingOwner::Of(object.name, info.st_ino, birth, links);
        for (const DirectoryRef& holder : {object.directory, FindEaDirectory(*object.directory)}) {
            if (!holder) continue;
            bool busy = false;
            if (const auto pending = Pending::Find(holder, owner, &busy)) {
                (void)Settling(object.directory, pending.get(), Unowned::kKept).Run();
                holder->ForgetEntries();
                any = true;
            }
            if (busy) throw Busy(object.path());
        }
    }
    return any;
}

void SettleNamed(const Object& object) { (void)SettleObject(object.place, StatusOf(object.place)); }

bool IsLeftPending(const DirectoryRef& holder, const Directory::Entry& entry) {
    const auto owner = PendingOwner::Parse(entry.name);
    if (!owner || !S_ISDIR(entry.type)) return false;
    try {
        bool busy = false;
        return Pending::Find(holder, *owner, &busy) != nullptr;
    } catch (const SystemFailure& failure) {
        if (failure.error() != EACCES) throw;
        return true;  // Who may not look into it is told when it is to be worked with.
    }
}

void UndoPending(const Place& from, const Place& to, const PendingOwner& owner) {
    const std::string old_start = NameInEaDirectory(from.name);
    const std::string new_start = NameInEaDirectory(to.name);
    for (const bool beside : {true, false}) {
        const DirectoryRef holder = beside ? to.directory : FindEaDirectory(*to.directory);
        if (!holder) continue;
        bool busy = false;
        const auto pending = Pending::Find(holder, owner, &busy);
        if (busy) throw Busy(from.path());
        if (!pending) continue;
        const auto old_place = [&](const std::string& name) -> Place {
            if (beside) {
                return {from.directory, name == to.name ? from.name : AppleDoubleName(from.name)};
            }
            const DirectoryRef ea_dir = NeedEaDirectory(*from.directory);
            if (name == to.name) return {ea_dir, from.name};
            return {ea_dir, old_start + name.substr(std::min(new_start.size(), name.size()))};
        };
        for (const Pending::Entry& entry : pending->Entries()) {
            const auto info = entry.in->StatusOf(entry.name);
            if (!info) continue;
            const Place old = old_place(entry.name);
            const auto there = old.Status();
            if (entry.part == Part::kDropped || (there && SameFile(*there, *info))) {
                (void)entry.in->Remove(entry.name);
            } else if (!entry.in->RenameToNew(entry.name, *old.directory, old.name)) {
                throw Failure(kFailed, old.path(),
                              "it is in the way of what a rename that was cut short has left in " +
                                  Printable(pending->path()),
                              "see which of the two is right, and move the other away");
            }
        }
        (void)pending->Remove();
        holder->ForgetEntries();
    }
}

}  // namespace mavoea::tool

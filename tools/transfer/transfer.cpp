#include "tools/transfer/transfer.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>

#include "format/netatalk_record.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "tools/store/marks.h"
#include "tools/store/metadata.h"
#include "tools/store/reader.h"
#include "tools/store/rights.h"
#include "tools/store/writer.h"
#include "tools/transfer/indexes.h"
#include "tools/transfer/permissions.h"
#include "tools/transfer/rename.h"

namespace mavoea::tool {

// One object under way.
struct Leg {
    Object from;
    Object to;
    std::shared_ptr<const Inode> source;
    Sidecars sidecars;  // of the source
    Metadata wanted;
    bool replaces;                        // something that is there
    std::shared_ptr<const Inode> target;  // once it is there
};

namespace {

bool HoldsContents(const struct stat& info) {
    return S_ISREG(info.st_mode) || S_ISDIR(info.st_mode);
}

std::pair<dev_t, ino_t> IdOf(const struct stat& info) { return {info.st_dev, info.st_ino}; }

Failure HasBecomeAnother(const Place& place) {
    return {kFailed, place.path(), "it has become another file", "try again"};
}

// ---- New links and special files ----------------------------------------------------------------

// A name that is used by nothing else in the directory of `target`; it goes away at the end of its
// scope, unless it has been given to the target.
class TemporaryNode {
 public:
    // `make` makes a file of that name in an open directory, and returns a negative value when it
    // cannot. Null then, with errno.
    template <class Make>
    static std::unique_ptr<TemporaryNode> TryToMake(const Place& target, Make make) {
        constexpr int kAttempts = 100;
        for (int attempt = 1;; ++attempt) {
            const Place place = {target.directory, TemporaryName()};
            if (make(place.directory->fd(), place.name.c_str()) >= 0) {
                return std::unique_ptr<TemporaryNode>(new TemporaryNode(target, place));
            }
            if (errno != EEXIST || attempt == kAttempts) return nullptr;
        }
    }
    template <class Make>
    static std::unique_ptr<TemporaryNode> MakeBy(const Place& target, Make make) {
        if (auto made = TryToMake(target, make)) return made;
        throw SystemFailure(target.path(), errno);
    }

    ~TemporaryNode() {
        if (made_) (void)::unlinkat(place_.directory->fd(), place_.name.c_str(), 0);
    }
    TemporaryNode(const TemporaryNode&) = delete;
    TemporaryNode& operator=(const TemporaryNode&) = delete;

    const std::shared_ptr<const Inode>& inode() const { return inode_; }

    void GiveToTarget() {
        place_.directory->Rename(place_.name, *target_.directory, target_.name);
        // Two names of one file are left as they are.
        (void)::unlinkat(place_.directory->fd(), place_.name.c_str(), 0);
        made_ = false;
        if (!SameFile(StatusOf(target_), inode_->info())) throw HasBecomeAnother(target_);
    }

 private:
    TemporaryNode(const Place& target, const Place& place)
        : target_(target), place_(place), inode_(Inode::Open(place)) {}

    const Place target_;
    const Place place_;
    std::shared_ptr<const Inode> inode_;
    bool made_ = true;
};

std::string LinkTarget(const Place& place) {
    std::string text(static_cast<std::size_t>(PATH_MAX), '\0');
    const ssize_t size =
        ::readlinkat(place.directory->fd(), place.name.c_str(), text.data(), text.size());
    if (size < 0) throw SystemFailure(place.path(), errno);
    text.resize(static_cast<std::size_t>(size));
    return text;
}

// ---- What arrives -------------------------------------------------------------------------------

// On a volume that keeps no metadata.
void AddUnkept(const Leg& leg, std::vector<Missing>* missing) {
    const std::string reason = NoStore(leg.to).cause();
    for (const Missing& one : ItemsOf(leg.wanted, reason)) missing->push_back(one);
    for (const Metadata::ServiceFile& file : leg.wanted.services) {
        missing->push_back({NameOfAttribute(file.name) + " of another service", reason});
    }
    if (leg.wanted.locked && !LocksByMode(leg.from)) missing->push_back({"locked state", reason});
    if (leg.wanted.hidden) missing->push_back({"hidden mark", reason});
}

bool Names(const std::vector<Missing>& missing, const std::string& item) {
    return std::any_of(missing.begin(), missing.end(),
                       [&](const Missing& one) { return one.item == item; });
}

// Whether attributes of the object travel as its metadata, and not with its mode and owner.
bool TravelsAsMetadata(const std::string& attribute, const Object& from, const Object& to) {
    if (IsMark(attribute)) return true;
    if (IsOfRecord(attribute)) {
        return from.kind() == VolumeKind::kFileEA || to.kind() == VolumeKind::kFileEA;
    }
    if (from.keeping() != Keeping::kXattr || to.keeping() == Keeping::kXattr) return false;
    return !attribute.starts_with("system.") && !attribute.starts_with("security.") &&
           !attribute.starts_with("trusted.");
}

// What the target gets in the end.
struct FinalMode {
    mode_t mode;         // without the lock
    bool locks = false;  // the write bits go, and are remembered
};

// Where the permissions say whether a file is locked, the metadata decides on the write bits.
FinalMode FinalModeOf(const Leg& leg) {
    const struct stat& info = leg.source->info();
    const struct stat now = leg.target->Status();
    mode_t mode = info.st_mode & kPermissionBits;
    // Nobody gets another user's rights by a copy of his program.
    if (now.st_uid != info.st_uid || now.st_gid != info.st_gid) mode &= ~mode_t{S_ISUID | S_ISGID};
    if (!LocksByMode(leg.to)) return {mode};
    if (leg.wanted.locked) return {LocksByMode(leg.from) ? UnlockedMode(*leg.source) : mode, true};
    return {(mode & kWriteBits) == 0 ? mode | S_IWUSR : mode};
}

void SetTimes(const Leg& leg) {
    leg.target->SetTimes({leg.source->info().st_atim, leg.source->info().st_mtim});
}

}  // namespace

Transfer::Transfer(TransferOptions options)
    : options_(std::move(options)), watch_{options_.on_bytes, options_.give_up} {}

// The destination need not be there for its volume's type to be known.
Leg Transfer::LegFor(const Place& from, const Place& to) const {
    const auto source = Inode::Open(from);
    const Object object = ObjectAt(from, &source->info());
    const Object target = AsReadable(ObjectAt(to, nullptr));
    Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kFind);
    Metadata wanted = ReadMetadata(object, sidecars);
    return {object, target, source, std::move(sidecars), std::move(wanted), to.Status().has_value(),
            nullptr};
}

void Transfer::CopyObject(const Place& from, const Place& to) {
    Leg leg = LegFor(from, to);
    RequireNotMade(from, to);
    RequireNoMetadata(from, to);
    if (!CopyName(&leg)) {
        if (S_ISREG(leg.source->info().st_mode)) {
            CopyFile(&leg, false);
        } else {
            CopyNode(&leg);
        }
        if (leg.source->info().st_nlink > 1) {
            first_names_.insert_or_assign(IdOf(leg.source->info()), to);
        }
    }
    Finish(&leg);
}

void Transfer::CopyContents(const Place& from, const Place& to) {
    Leg leg = LegFor(from, to);
    RequireNotMade(from, to);
    CopyFile(&leg, true);
    Finish(&leg);
}

void Transfer::CopyFile(Leg* leg, bool stream) {
    constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK | O_NOFOLLOW;
    const Place& from = leg->from.place;
    const File source(OpenQuietly(from.directory->fd(), from.name.c_str(), kFlags), from.path());
    if (source.fd() < 0) throw SystemFailure(from.path(), errno);
    leg->source = Inode::Of(source);
    if (!stream && !S_ISREG(leg->source->info().st_mode)) throw HasBecomeAnother(from);
    TemporaryFile temporary(leg->to.place);
    if (stream) {
        CopyStream(source, temporary.file(), watch_);
    } else {
        CopyData(source, temporary.file(), watch_);
    }
    leg->target = Inode::Of(temporary.file());
    NotePermissions(
        *leg, CopyPermissions({leg->source, source.fd()}, {leg->target, temporary.file().fd()},
                              [&](const std::string& name) {
                                  return !TravelsAsMetadata(name, leg->from, leg->to);
                              }));
    temporary.GiveToTarget();
}

void Transfer::CopyNode(Leg* leg) {
    const struct stat& info = leg->source->info();
    const auto node = TemporaryNode::MakeBy(leg->to.place, [&](int directory, const char* name) {
        if (S_ISLNK(info.st_mode)) {
            return ::symlinkat(LinkTarget(leg->from.place).c_str(), directory, name);
        }
        return ::mknodat(directory, name, (info.st_mode & S_IFMT) | S_IRUSR | S_IWUSR,
                         info.st_rdev);
    });
    leg->target = node->inode();
    NotePermissions(*leg,
                    CopyPermissions({leg->source}, {leg->target}, [&](const std::string& name) {
                        return !TravelsAsMetadata(name, leg->from, leg->to);
                    }));
    node->GiveToTarget();
}

// One more name for what has been copied before. False when it has not, or cannot have that name,
// or would take the metadata of the first one with it.
bool Transfer::CopyName(Leg* leg) {
    if (leg->source->info().st_nlink < 2) return false;
    const auto first = first_names_.find(IdOf(leg->source->info()));
    if (first == first_names_.end()) return false;
    const Place& there = first->second;
    const bool in_inode =
        leg->to.keeping() == Keeping::kXattr || leg->to.kind() == VolumeKind::kFileEA;
    if (in_inode) {
        const auto info = StatusOf(there);
        const Metadata other =
            ReadMetadata(AsReadable(ObjectAt(there, &info)), Sidecars::Services::kLeaveOut);
        Metadata own = leg->wanted;
        own.services.clear();
        if (leg->to.kind() == VolumeKind::kFileEA) own.attributes.clear();
        if (!WhatIsMissing(own, other).empty() || own.entries.size() != other.entries.size() ||
            (own.attributes.size() != other.attributes.size() &&
             leg->to.keeping() == Keeping::kXattr) ||
            own.finder_info.has_value() != other.finder_info.has_value()) {
            leg->wanted.strays.push_back(
                {"being one file with " + Printable(there.path()),
                 "names of one file have one metadata there, and here each has its own",
                 {}});
            return false;
        }
    }
    const auto node = TemporaryNode::TryToMake(leg->to.place, [&](int directory, const char* name) {
        return ::linkat(there.directory->fd(), there.name.c_str(), directory, name, 0);
    });
    if (!node) return false;
    leg->target = node->inode();
    node->GiveToTarget();
    return true;
}

void Transfer::NotePermissions(const Leg& leg, const std::optional<std::string>& problem) const {
    if (problem) options_.on_note(Printable(leg.to.path()) + ": " + *problem);
    if (!HoldsContents(leg.source->info())) return;
    // The owner of a file or directory can still change it.
    const mode_t mode = leg.source->info().st_mode;
    const mode_t least = S_ISDIR(mode) ? S_IRWXU : S_IRUSR | S_IWUSR;
    if ((mode & least) != least) leg.target->SetMode((mode & kPermissionBits) | least);
}

// All that comes once the data is in its place. Mode and times are right also when the metadata
// could not be copied.
void Transfer::Finish(Leg* leg) {
    made_.insert_or_assign(IdOf(leg->target->info()), leg->to.place.name);
    made_apple_double_ = made_apple_double_ || leg->to.place.name.starts_with(AppleDoubleName({}));
    volumes_.try_emplace(leg->target->info().st_dev, leg->to.place.directory);
    std::vector<Missing> missing;
    Metadata fitting;
    Written written;
    std::optional<Failure> failure;
    const bool holds = HoldsContents(leg->source->info());
    const FinalMode final_mode = FinalModeOf(*leg);
    WriteOptions write = {.durability = Durability::kLater};
    if (holds) write.mode = final_mode.locks ? final_mode.mode & ~kWriteBits : final_mode.mode;
    const bool keeps = leg->to.kind() != VolumeKind::kNone;
    NoteOrphan(*leg);
    if (keeps && !leg->to.is_root()) {
        try {
            const Writer& writer = WriterFor(leg->to);
            fitting = writer.Fit(leg->wanted, leg->to, &missing);
            written = writer.Write(leg->to, fitting, write);
        } catch (const Failure& problem) {
            failure = problem;
        }
    }
    if (holds && final_mode.locks) {
        LockMode(*leg->target, final_mode.mode);
    } else if (holds) {
        leg->target->SetMode(final_mode.mode);
    }
    SetTimes(*leg);
    ReportNew(leg->to.path(), leg->source->info().st_mode);
    if (failure) {
        throw Failure(kFailed, leg->from.path(),
                      "its metadata could not be copied: " + std::string(failure->what()),
                      "see what is in the way, and copy it again");
    }
    if (!keeps) AddUnkept(*leg, &missing);
    for (const Missing& one : written.missing) missing.push_back(one);
    const auto whole = [&](const std::string& path) { return written.whole.contains(path); };
    if (fitting.whole_record) written.whole.insert(leg->from.path());
    if (keeps && leg->wanted.HasAny()) {
        const auto damaged = [&](const auto& item) {
            return item.value.damaged() && whole(item.holder);
        };
        std::erase_if(fitting.attributes, damaged);
        if (fitting.finder_info && damaged(*fitting.finder_info)) fitting.finder_info.reset();
        if (fitting.fork && damaged(*fitting.fork)) fitting.fork.reset();
        std::erase_if(fitting.entries, [&](const auto& entry) { return damaged(entry.second); });
    }
    if (keeps && (leg->wanted.HasAny() || leg->wanted.locked || leg->wanted.hidden)) {
        const Metadata found = ReadMetadata(leg->to, Sidecars::Services::kFind);
        for (const Missing& one : WhatIsMissing(fitting, found)) {
            if (!Names(missing, one.item)) missing.push_back(one);
        }
    }
    for (const Metadata::Stray& stray : leg->wanted.strays) {
        if (!whole(stray.holder)) missing.push_back({stray.item, stray.reason});
    }
    for (const Failure& problem : leg->wanted.problems) {
        if (!whole(problem.subject())) {
            missing.push_back({Printable(problem.subject()), problem.cause()});
        }
    }
    if (!missing.empty()) {
        NoteCopied(*leg);
        throw Loss(kFailed, leg->from.path(),
                   "not all of its metadata arrived at " + Printable(leg->to.path()) + ": " +
                       Joined(missing),
                   "keep the original, or take the rest along by hand");
    }
    for (const std::string& path : leg->wanted.earlier) {
        options_.on_note(Printable(leg->to.path()) +
                         ": has in the current layout what an earlier " + "version kept in " +
                         Printable(path));
    }
    NoteCopied(*leg);
}

// A "._" file of an object that had gone: it is nothing of this one's, and makes room.
void Transfer::NoteOrphan(const Leg& leg) const {
    const Keeping keeping = leg.to.keeping();
    const std::string name = AppleDoubleName(leg.to.place.name);
    if (leg.replaces || name.empty() || keeping == Keeping::kXattr || keeping == Keeping::kNone) {
        return;
    }
    if (!IsAppleDouble(*leg.to.place.directory, name)) return;
    options_.on_note(Printable(leg.to.place.directory->PathOf(name)) +
                     ": was metadata of no object, and has made room for that of " +
                     Printable(leg.to.path()));
}

void Transfer::NoteCopied(const Leg& leg) {
    if (!options_.remembers) return;
    copied_.insert_or_assign(IdOf(leg.source->info()), leg.source->info());
    for (const Sidecars::Found& file : leg.sidecars.Files()) {
        copied_.insert_or_assign(IdOf(file.info), file.info);
    }
}

// One file cannot be both: an object that was copied, and metadata of another one.
void Transfer::RequireNoMetadata(const Place& from, const Place& to) const {
    const Keeping keeping = AsReadable(ObjectAt(to, nullptr)).keeping();
    if (keeping != Keeping::kAppleDouble && keeping != Keeping::kEaDirectory) return;
    const Directory& there = *to.directory;
    const auto was_made = [&](const std::string& name) {
        const auto info = there.StatusOf(name);
        const auto found = info ? made_.find(IdOf(*info)) : made_.end();
        return found != made_.end() && found->second == name;
    };
    const std::string prefix = AppleDoubleName({});
    const bool is_prefixed = to.name.starts_with(prefix);
    const std::string object = is_prefixed ? to.name.substr(prefix.size()) : std::string();
    if (!object.empty() && there.Has(object) && IsAppleDouble(there, to.name)) {
        throw Failure(kFailed, from.path(),
                      "its place is that of metadata of '" + Printable(there.PathOf(object)) + '\'',
                      "give it another name");
    }
    if (!object.empty() && was_made(object) && IsAppleDouble(*from.directory, from.name)) {
        throw Failure(
            kFailed, from.path(),
            "it would be metadata of '" + Printable(there.PathOf(object)) + "', just made, there",
            "give it another name");
    }
    const std::string own = AppleDoubleName(to.name);
    if (made_apple_double_ && !own.empty() && was_made(own) && IsAppleDouble(there, own)) {
        throw Failure(
            kFailed, from.path(),
            "'" + Printable(there.PathOf(own)) + "', just made, would be its metadata there",
            "give that another name");
    }
}

// What this has just made there, under a name that the file system takes for the same.
void Transfer::RequireNotMade(const Place& from, const Place& to) const {
    const auto there = to.Status();
    const auto found = there ? made_.find(IdOf(*there)) : made_.end();
    if (found == made_.end()) return;
    const bool same = found->second == to.name;
    if (same && S_ISDIR(there->st_mode)) return;
    const std::string other = Printable(to.directory->PathOf(found->second));
    throw Failure(kFailed, from.path(),
                  same ? "it would overwrite '" + other + "', just made"
                       : "its name is the same as that of '" + other + "', just made, there",
                  "give it another name");
}

DirectoryRef Transfer::MakeDirectory(const Place& from, const Place& to) {
    RequireNotMade(from, to);
    RequireNoMetadata(from, to);
    const auto there = to.Status();
    if (there && !S_ISDIR(there->st_mode)) throw SystemFailure(to.path(), ENOTDIR);
    DirectoryRef made = there ? to.directory->OpenIn(to.name) : to.directory->MakeIn(to.name);
    made_.insert_or_assign(IdOf(made->Status()), to.name);
    return made;
}

void Transfer::FinishDirectory(const Place& from, const Directory& inside, const Place& to,
                               const DirectoryRef& made) {
    Leg leg = LegFor(from, to);
    const File source = inside.Reopened();
    const File target = made->Reopened();
    leg.source = Inode::Of(source);
    leg.target = Inode::Of(target);
    if (!SameFile(StatusOf(to), leg.target->info())) throw HasBecomeAnother(to);
    std::optional<Failure> failure;
    for (const Directory::Entry& entry : inside.Entries()) {
        if (!IsMetadata(inside, entry, leg.from.type) || !S_ISDIR(entry.type)) continue;
        try {
            CopyLeftOvers(inside, made, entry);
        } catch (const Failure& problem) {
            failure = problem;
        }
    }
    if (leg.to.keeping() == Keeping::kXattr || leg.to.kind() == VolumeKind::kFileEA) {
        for (const std::string& name : leg.target->AttributeNames()) {
            // What is wanted of it is written anew.
            const bool goes = leg.to.keeping() == Keeping::kXattr
                                  ? TravelsAsMetadata(name, leg.to, Object()) && !IsMark(name)
                                  : name == kNetatalkAttribute;
            if (goes) (void)leg.target->RemoveAttribute(name);
        }
    }
    NotePermissions(leg, CopyPermissions({leg.source, source.fd()}, {leg.target, target.fd()},
                                         [&](const std::string& name) {
                                             return !TravelsAsMetadata(name, leg.from, leg.to);
                                         }));
    Finish(&leg);
    if (failure) throw Failure(*failure);
}

// What is in the EA directory of a directory and went with no object in it.
void Transfer::CopyLeftOvers(const Directory& inside, const DirectoryRef& made,
                             const Directory::Entry& entry) {
    const DirectoryRef ea_dir = inside.OpenIn(entry.name);
    const Object inner = ObjectAt({made, entry.name}, nullptr);
    const bool keeps = AsReadable(inner).keeping() == Keeping::kEaDirectory;
    std::vector<Missing> missing;
    for (const LeftOver& file : FindLeftOver(inside, *ea_dir)) {
        const struct stat& info = file.found.info;
        if (WasCopied(info)) continue;
        const std::string item = Printable(file.found.path());
        if (!S_ISREG(info.st_mode)) {
            missing.push_back({item, "it is no regular file"});
        } else if (!keeps) {
            missing.push_back({item, "it belongs to no object, and the destination keeps no such"});
        } else {
            try {
                if (CopyLeftOver(file, made)) {
                    copied_.insert_or_assign(IdOf(info), info);
                } else {
                    missing.push_back({item, "something of its name is at the destination"});
                }
            } catch (const Failure& failure) {
                missing.push_back({item, failure.cause()});
            }
        }
    }
    if (missing.empty()) return;
    throw Loss(kFailed, ea_dir->path(), "not all that is in it arrived: " + Joined(missing),
               "keep the original, or take the rest along by hand");
}

bool Transfer::Rename(const Place& from, const Place& to) {
    const auto there = to.Status();
    if (!there || !SameFile(*there, StatusOf(from))) RequireNotMade(from, to);
    if (!RenameObject(from, to)) return false;
    made_.insert_or_assign(IdOf(StatusOf(to)), to.name);
    return true;
}

void Transfer::MakeDurable() {
    for (const auto& [device, directory] : volumes_) directory->SyncVolume();
}

bool Transfer::WasCopied(const struct stat& info) const {
    const auto found = copied_.find(IdOf(info));
    if (found == copied_.end()) return false;
    const struct stat& then = found->second;
    const auto same = [](const timespec& one, const timespec& other) {
        return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
    };
    if (S_ISDIR(info.st_mode)) return true;  // what was in it has been removed
    return then.st_size == info.st_size && same(then.st_mtim, info.st_mtim) &&
           (then.st_nlink > 1 || same(then.st_ctim, info.st_ctim));
}

}  // namespace mavoea::tool

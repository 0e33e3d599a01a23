#include "tools/transfer/transfer.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <exception>
#include <set>

#include "format/netatalk_record.h"
#include "tools/place/dry_run.h"
#include "tools/say/job.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "tools/store/combination.h"
#include "tools/store/fitting.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/marks.h"
#include "tools/store/metadata.h"
#include "tools/store/reader.h"
#include "tools/store/rewriting.h"
#include "tools/store/rights.h"
#include "tools/store/writer.h"
#include "tools/transfer/indexes.h"
#include "tools/transfer/own_attributes.h"
#include "tools/transfer/permissions.h"
#include "tools/transfer/rename.h"
#include "util/fnv.h"

namespace mavoea::tool {

// One object under way.
struct Leg {
    Object from;
    Object to;
    std::shared_ptr<const Inode> source;
    Sidecars sidecars;  // of the source
    Metadata wanted;
    OwnAttributes own_attributes;              // of the source
    bool replaces;                             // something that is there
    std::shared_ptr<const Inode> target = {};  // once it is there
    std::optional<mode_t> former_mode = {};    // of a target that is written over
    bool is_link = false;                      // the target is one more name of a file
    // Where the metadata of the target stays: what is wanted besides, and whether that is nothing.
    std::optional<std::vector<std::string>> added = {};
    bool stays = false;
};

namespace {

bool HoldsContents(const struct stat& info) {
    return S_ISREG(info.st_mode) || S_ISDIR(info.st_mode);
}

std::pair<dev_t, ino_t> IdOf(const struct stat& info) { return {info.st_dev, info.st_ino}; }

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

// What the target gets in the end.
struct FinalMode {
    mode_t mode;         // without the lock
    bool locks = false;  // the write bits go, and are remembered
};

// With which mode a new file begins; it may have all of it at once when nothing is kept.
mode_t WantedMode(const struct stat& info, const Manner& manner) {
    constexpr mode_t kAll = S_IRWXU | S_IRWXG | S_IRWXO;
    constexpr mode_t kExecution = S_IXUSR | S_IXGRP | S_IXOTH;
    if (!manner.denies_mode) return info.st_mode & (S_ISDIR(info.st_mode) ? kAll | S_ISVTX : kAll);
    return S_ISDIR(info.st_mode) ? kAll : kAll & ~kExecution;
}
bool BeginsClosed(const Manner& manner) { return manner.keeps_mode || manner.keeps_owner; }
mode_t FirstMode(const struct stat& info, const Manner& manner) {
    const mode_t least = S_ISDIR(info.st_mode) ? S_IRWXU : S_IRUSR | S_IWUSR;
    return BeginsClosed(manner) ? least : WantedMode(info, manner);
}

// Of what was made with the mode above.
mode_t MadeMode(const Leg& leg, const Manner& manner) {
    if (leg.former_mode) return *leg.former_mode;
    if (BeginsClosed(manner)) return WantedMode(leg.source->info(), manner) & ~manner.umask;
    const struct stat& made = leg.target->info();
    // Its owner was to write into it.
    const mode_t added =
        S_ISDIR(made.st_mode) ? S_IRWXU & ~WantedMode(leg.source->info(), manner) : 0;
    return made.st_mode & kPermissionBits & ~added;
}

mode_t KeptMode(const Leg& leg) {
    const struct stat& info = leg.source->info();
    const struct stat now = leg.target->Status();
    const mode_t mode = info.st_mode & kPermissionBits;
    // Nobody gets another user's rights by a copy of his program.
    const bool same = now.st_uid == info.st_uid && now.st_gid == info.st_gid;
    return same ? mode : mode & ~mode_t{S_ISUID | S_ISGID};
}

// Where the permissions say whether a file is locked, the metadata decides on the write bits.
FinalMode FinalModeOf(const Leg& leg, const Manner& manner) {
    const mode_t mode = manner.keeps_mode ? KeptMode(leg) : MadeMode(leg, manner);
    if (!LocksByMode(leg.to)) return {mode};
    if (leg.wanted.locked) {
        const bool unlocks = LocksByMode(leg.from) && manner.keeps_mode;
        return {unlocks ? UnlockedMode(*leg.source) : mode, true};
    }
    // What was there and is written over stays as it was.
    if (!manner.keeps_mode && leg.former_mode) return {mode};
    return {(mode & kWriteBits) == 0 ? mode | S_IWUSR : mode};
}

void SetTimes(const Leg& leg) {
    leg.target->SetTimes({leg.source->info().st_atim, leg.source->info().st_mtim});
}

std::string Creating(const struct stat& info, const Place& to) {
    switch (info.st_mode & S_IFMT) {
        case S_IFREG:
            return "cannot create regular file " + Quoted(to.path());
        case S_IFLNK:
            return "cannot create symbolic link " + Quoted(to.path());
        case S_IFIFO:
            return "cannot create fifo " + Quoted(to.path());
        default:
            return "cannot create special file " + Quoted(to.path());
    }
}

// Says what cannot be made in the words of cp, which nobody puts together before.
template <class Words, class Make>
auto Made(Words what, Make make) {
    try {
        return make();
    } catch (const SystemFailure& failure) {
        throw Refusal(what(), failure.error());
    }
}

// ---- What has been copied -----------------------------------------------------------------------

// Two states of files differ in their hashes, as far as 64 bits go.
class Hash {
 public:
    Hash& Add(std::uint64_t value) {
        constexpr std::uint64_t kFactor = 0x9E3779B97F4A7C15;
        value_ = (value_ ^ value) * kFactor;
        value_ ^= value_ >> 29;
        return *this;
    }
    Hash& Add(const timespec& time) {
        return Add(static_cast<std::uint64_t>(time.tv_sec))
            .Add(static_cast<std::uint64_t>(time.tv_nsec));
    }
    std::uint64_t value() const { return value_; }

 private:
    std::uint64_t value_ = 0;
};

// Of a directory that it is there: what was in it has been removed.
std::uint64_t HashOf(const struct stat& info, bool with_change_time) {
    Hash hash;
    hash.Add(info.st_dev).Add(info.st_ino).Add(info.st_mode & S_IFMT);
    if (S_ISDIR(info.st_mode)) return hash.value();
    hash.Add(static_cast<std::uint64_t>(info.st_size)).Add(info.st_mtim);
    if (with_change_time) hash.Add(info.st_ctim);
    return hash.value();
}

std::uint64_t HashOf(const struct stat& info) { return HashOf(info, info.st_nlink == 1); }

// As the "._" file of the object of that name. No other file, nor this one where it is anything
// else, has that hash.
std::uint64_t HashAsMetadata(const std::string& object, const struct stat& info) {
    return Hash().Add(HashOf(info, true)).Add(Fnv::Of(object)).value();
}

bool SameState(const struct stat& one, const struct stat& other) {
    return HashOf(one, false) == HashOf(other, false);
}

// What would be at the destination from here on, for whatever looks there later in a dry run.
// `copied` is where it has its contents from.
std::shared_ptr<const Inode> Foresee(const Place& to, bool replaces, const struct stat& info,
                                     const Place& copied) {
    int error = replaces ? WhyNoRemoval(to) : WhyNoNewFile(*to.directory);
    if (error == 0 && replaces && S_ISDIR(StatusOf(to).st_mode)) error = EISDIR;
    if (error != 0) throw SystemFailure(to.path(), error);
    // Of others nobody asks for what is in them.
    const bool may_be_metadata = to.name.starts_with(AppleDoubleName({}));
    Foreseen::Come(to, info, may_be_metadata ? &copied : nullptr);
    return Inode::Foresee(to, info);
}

void ForeseeTarget(Leg* leg, mode_t mode, const Manner& manner) {
    const struct stat& source = leg->source->info();
    struct stat info = Foreseen::StatusOfNew(*leg->to.place.directory, mode);
    info.st_size = manner.data ? source.st_size : 0;
    info.st_rdev = source.st_rdev;
    if (manner.keeps_times) info.st_mtim = source.st_mtim;
    leg->target = Foresee(leg->to.place, leg->replaces, info, leg->from.place);
}

// One more name for the file at `there`.
void ForeseeLink(Leg* leg, const Place& there) {
    const struct stat info = StatusOf(there);
    if (info.st_dev != leg->to.place.directory->Status().st_dev) {
        throw SystemFailure(leg->to.path(), EXDEV);
    }
    leg->target = Foresee(leg->to.place, leg->replaces, info, leg->from.place);
}

// What is read of it. A Failure in the words of cp when nothing may be.
std::shared_ptr<const File> ContentsOf(const Leg& leg) {
    if (auto file = leg.source->file()) return file;
    const Place& from = leg.from.place;
    constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK | O_NOFOLLOW;
    const File again(OpenQuietly(from.directory->fd(), from.name.c_str(), kFlags), from.path());
    if (again.fd() >= 0) throw HasBecomeAnother(from);
    throw Refusal("cannot open " + Quoted(from.path()) + " for reading", errno);
}

std::shared_ptr<const Inode> OpenSource(const Place& from, mode_t type) {
    return S_ISREG(type) ? Inode::OpenToRead(from) : Inode::Open(from);
}

// The destination need not be there for its volume's type to be known.
Object TargetAt(const Place& to, mode_t type) {
    return AsReadable(S_ISDIR(type) ? ObjectAt(to, nullptr) : ObjectAt(to, type));
}

// What the copy of `from` at `there` has.
Metadata MetadataOfCopy(const Place& from, const Place& there) {
    const auto info = StatusOf(there);
    const Object copy = AsReadable(ObjectAt(there, &info));
    if (Foreseen::Find(*there.directory, there.name) == nullptr) {
        return ReadMetadata(copy, Sidecars::Services::kLeaveOut);
    }
    const auto source = StatusOf(from);
    std::vector<Missing> missing;
    return WriterFor(copy).Fit(ReadMetadata(ObjectAt(from, &source), Sidecars::Services::kLeaveOut),
                               copy, &missing);
}

// Whether the copy of `first` at `there` may have this object's metadata, too, where that is in the
// file itself.
bool SharesMetadata(const Place& first, const Place& there, const Leg& leg) {
    if (!KeepsInInode(leg.to)) return true;
    // A dry run has nothing to ask any more where the first would have been moved.
    if (DryRun() && !first.Status()) return true;
    Metadata other = MetadataOfCopy(first, there);
    Metadata own = leg.wanted;
    std::erase_if(other.attributes, [&](const Metadata::Attribute& attribute) {
        return own.Find(attribute.name) == nullptr && leg.own_attributes.HasAs(attribute);
    });
    // Each name has files of its own for these.
    own.services.clear();
    for (Metadata* const one : {&own, &other}) {
        if (!KeepsForkInInode(leg.to) || (one->fork && IsBlankFork(one->fork->value))) {
            one->fork.reset();
        }
        if (leg.to.kind() == VolumeKind::kFileEA) one->attributes.clear();
    }
    return WhatIsMissing(own, other).empty() && own.entries.size() == other.entries.size() &&
           own.attributes.size() == other.attributes.size() &&
           own.finder_info.has_value() == other.finder_info.has_value() &&
           own.fork.has_value() == other.fork.has_value();
}

// What of the metadata of an object that is written over lies in its attributes. What is wanted of
// it is written anew; what the source has of its own is no metadata in the copy either.
void RemoveFormerAttributes(const Leg& leg) {
    if (!KeepsInInode(leg.to)) return;
    for (const std::string& name : leg.target->AttributeNames()) {
        const bool goes = leg.to.kind() != VolumeKind::kFileEA
                              ? TravelsAsMetadata(name, leg.to, Object()) && !IsMark(name)
                              : name == kNetatalkAttribute;
        if (goes && !leg.own_attributes.Has(name)) (void)leg.target->RemoveAttribute(name);
    }
}

// What a service is changing stays as it is, and so does the data that belongs to it.
void RequireUnlockedTarget(const Leg& leg) {
    if (leg.replaces) RequireUnlocked(Sidecars::Find(leg.to, Sidecars::Services::kLeaveOut));
}

// What is written beside another program's metadata, or left there with other data, nobody sees.
void RequireSeen(const Leg& leg) {
    const Metadata& wanted = leg.wanted;
    const bool writes = wanted.HasAny() || wanted.locked || wanted.hidden || wanted.system;
    const bool leaves = leg.replaces && !leg.to.declared && SignOf(leg.to.place);
    if (writes || leaves) RequireDeclared(leg.to);
}

// What was to arrive, and what a writer said of it.
struct Arrival {
    Metadata fitting;
    Written written;
};

// What of the source could not be read, and did not go with all of its file.
void AddUnreadable(const Leg& leg, const std::set<std::string>& wholes,
                   std::vector<Missing>* missing) {
    for (const Metadata::Stray& stray : leg.wanted.strays) {
        if (!wholes.contains(stray.holder)) missing->push_back({stray.item, stray.reason});
    }
    for (const Failure& problem : leg.wanted.problems) {
        if (!wholes.contains(problem.subject())) {
            missing->push_back({Printable(problem.subject()), problem.cause()});
        }
    }
}

// What is not at the destination, after all, and what could not be read from the source.
void AddWhatDidNotArrive(const Leg& leg, Arrival arrival, std::vector<Missing>* missing) {
    Metadata& fitting = arrival.fitting;
    std::set<std::string>& wholes = arrival.written.whole;
    for (const Missing& one : arrival.written.missing) missing->push_back(one);
    if (fitting.whole_record) wholes.insert(leg.from.path());
    const auto whole = [&](const std::string& path) { return wholes.contains(path); };
    if (leg.wanted.HasAny()) {
        const auto damaged = [&](const auto& item) {
            return item.value.damaged() && whole(item.holder);
        };
        std::erase_if(fitting.attributes, damaged);
        if (fitting.finder_info && damaged(*fitting.finder_info)) fitting.finder_info.reset();
        if (fitting.fork && damaged(*fitting.fork)) fitting.fork.reset();
        std::erase_if(fitting.entries, [&](const auto& entry) { return damaged(entry.second); });
    }
    if (leg.wanted.HasAny() || leg.wanted.locked || leg.wanted.hidden) {
        const Metadata found =
            DryRun() ? fitting : ReadMetadata(leg.to, *leg.target, arrival.written.beside);
        for (const Missing& one : WhatIsMissing(fitting, found)) {
            if (!Names(*missing, one.item)) missing->push_back(one);
        }
    }
    AddUnreadable(leg, wholes, missing);
}

Metadata FitTo(const Leg& leg, std::vector<Missing>* missing) {
    if (!leg.added) return WriterFor(leg.to).Fit(leg.wanted, leg.to, missing);
    Fitting fit = FitAll(leg.to, leg.wanted, *leg.added);
    *missing = std::move(fit.missing);
    return std::move(fit.metadata);
}

}  // namespace

Transfer::Transfer(TransferOptions options)
    : options_(std::move(options)),
      data_(options_.watch, options_.manner.sparse, options_.manner.reflink) {}

Leg Transfer::LegFor(const Place& from, const Place& to) const {
    return LegOf(from, Inode::Open(from), to);
}

Leg Transfer::LegOf(const Place& from, const std::shared_ptr<const Inode>& source,
                    const Place& to) const {
    const mode_t type = source->info().st_mode & S_IFMT;
    const Object object = ObjectAt(from, type);
    const Object target = TargetAt(to, type);
    Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kFind);
    Metadata wanted = ReadMetadata(object, *source, sidecars);
    return {object,
            target,
            source,
            std::move(sidecars),
            std::move(wanted),
            OwnAttributes(object, source, target),
            to.Status().has_value()};
}

Leg Transfer::LegWithoutMetadata(const Place& from, const File& source, const Place& to) const {
    const Object object = {from, -1};
    const Object target = TargetAt(to, S_IFREG);
    const auto inode = Inode::Of(source);
    return {object,
            target,
            inode,
            {},
            {},
            OwnAttributes(object, inode, target),
            to.Status().has_value()};
}

void Transfer::CopyObject(const Place& from, mode_t type, const Place& to, Links links) {
    Leg leg = LegOf(from, OpenSource(from, type), to);
    RequireMayCome(leg);
    if (!CopyName(&leg, links)) {
        if (S_ISREG(leg.source->info().st_mode)) {
            CopyFile(&leg, nullptr);
        } else {
            CopyNode(&leg);
        }
        RememberName(leg, links);
    }
    Finish(&leg);
}

void Transfer::CopyContents(const Place& from, const File& source, const Place& to) {
    Leg leg = LegWithoutMetadata(from, source, to);
    RequireNotMade(from, to);
    RequireUnlockedTarget(leg);
    CopyFile(&leg, &source);
    Finish(&leg);
}

void Transfer::CopyFile(Leg* leg, const File* stream) {
    const std::shared_ptr<const File> own = stream == nullptr ? ContentsOf(*leg) : nullptr;
    const File& source = own ? *own : *stream;
    const Manner& manner = options_.manner;
    const auto making = [&] {
        // A move to another file system, over what is there.
        if (options_.remembers && leg->replaces) {
            return "inter-device move failed: " + Quoted(leg->from.path()) + " to " +
                   Quoted(leg->to.path()) + "; unable to remove target";
        }
        return Creating(leg->source->info(), leg->to.place);
    };
    if (DryRun()) {
        Made(making,
             [&] { ForeseeTarget(leg, S_IFREG | FirstMode(leg->source->info(), manner), manner); });
        ForeseeBytes(own.get());
        return CopyInodeTo(*leg, -1, -1);
    }
    const auto temporary = Made(making, [&] {
        return std::make_unique<TemporaryFile>(leg->to.place,
                                               FirstMode(leg->source->info(), manner));
    });
    const File& file = temporary->file();
    leg->target = Inode::Of(temporary->shared_file());
    CopyBytes(source, stream != nullptr, file);
    CopyInodeTo(*leg, source.fd(), file.fd());
    Made(making, [&] {
        if (leg->replaces) {
            temporary->GiveToTarget();
        } else {
            temporary->GiveToNewTarget();
        }
    });
}

void Transfer::ForeseeBytes(const File* source) const {
    if (options_.manner.data && source != nullptr) data_.Foresee(*source);
}

void Transfer::CopyBytes(const File& source, bool stream, const File& target) {
    if (!options_.manner.data) return;
    Made([&] { return "error writing " + Quoted(target.path()); },
         [&] {
             if (stream) {
                 data_.CopyStream(source, target);
             } else {
                 data_.Copy(source, target);
             }
         });
}

void Transfer::Overwrite(const Place& from, const File* stream, const Place& to, const File& target,
                         Links links) {
    Leg leg = stream != nullptr ? LegWithoutMetadata(from, *stream, to)
                                : LegOf(from, Inode::OpenToRead(from), to);
    RequireMayCome(leg);
    if (stream == nullptr && CopyName(&leg, links)) return Finish(&leg);
    const std::shared_ptr<const File> file = stream == nullptr ? ContentsOf(leg) : nullptr;
    const File& source = file ? *file : *stream;
    leg.target = DryRun() ? Inode::Open(to) : Inode::Of(target);
    leg.former_mode = leg.target->info().st_mode & kPermissionBits;
    if (stream != nullptr) RequireUnlockedTarget(leg);
    if (DryRun()) {
        ForeseeBytes(file.get());
    } else {
        // Nobody sees more of it than he may of what it will be.
        if (BeginsClosed(options_.manner)) {
            (void)::fchmod(target.fd(), *leg.former_mode & (S_IRUSR | S_IWUSR));
        }
        if (options_.manner.data) target.Resize(0);
        CopyBytes(source, stream != nullptr, target);
    }
    RemoveFormerAttributes(leg);
    CopyInodeTo(leg, source.fd(), target.fd());
    RememberName(leg, links);
    Finish(&leg);
}

void Transfer::CopyNode(Leg* leg) {
    Made([&] { return Creating(leg->source->info(), leg->to.place); }, [&] { MakeNode(leg); });
}

void Transfer::MakeNode(Leg* leg) const {
    const Manner& manner = options_.manner;
    const struct stat& info = leg->source->info();
    const mode_t type = info.st_mode & S_IFMT;
    const mode_t mode = S_ISLNK(type) ? S_IRWXU | S_IRWXG | S_IRWXO : FirstMode(info, manner);
    std::unique_ptr<TemporaryNode> node;
    if (DryRun()) {
        const bool takes_root = S_ISCHR(type) || S_ISBLK(type);
        if (takes_root && ::geteuid() != 0) throw SystemFailure(leg->to.path(), EPERM);
        ForeseeTarget(leg, type | mode, manner);
    } else {
        node = TemporaryNode::MakeBy(leg->to.place, [&](int directory, const char* name) {
            return S_ISLNK(type) ? ::symlinkat(LinkTarget(leg->from.place).c_str(), directory, name)
                                 : ::mknodat(directory, name, type | mode, info.st_rdev);
        });
        leg->target = node->inode();
    }
    CopyInodeTo(*leg, -1, -1);
    if (!S_ISLNK(type)) {
        leg->target->SetMode(manner.keeps_mode ? KeptMode(*leg) : MadeMode(*leg, manner));
    }
    if (node) node->GiveToTarget();
}

void Transfer::CopyStream(const File& source, const File& target) {
    if (!DryRun()) data_.CopyStream(source, target);
}

void Transfer::CarryMetadata(const Place& from, const Place& to) {
    Leg leg = LegFor(from, to);
    leg.target = Inode::Open(to);
    leg.former_mode = leg.target->info().st_mode & kPermissionBits;
    RequireSeen(leg);
    RequireUnlockedTarget(leg);
    RemoveFormerAttributes(leg);
    Finish(&leg);
}

void Transfer::LinkObject(const Place& from, const Place& to) {
    Leg leg = LegFor(from, to);
    RequireMayCome(leg);
    RequireUnlockedTarget(leg);
    const auto what = [&] {
        return "cannot create hard link " + Quoted(to.path()) + " to " + Quoted(from.path());
    };
    const bool alike = leg.from.kind() == leg.to.kind() && leg.from.dialect() == leg.to.dialect();
    if (!alike && KeepsInInode(leg.to) && leg.wanted.HasAny()) {
        throw Failure(
            kFailed, from.path(),
            "a link at " + Printable(to.path()) +
                " would keep its metadata in the file itself, which is this one's as well",
            "copy it");
    }
    leg.is_link = true;
    if (DryRun()) {
        Made(what, [&] { ForeseeLink(&leg, from); });
        return Finish(&leg);
    }
    const auto node = Made(what, [&] {
        return TemporaryNode::MakeBy(to, [&](int directory, const char* name) {
            return ::linkat(from.directory->fd(), from.name.c_str(), directory, name, 0);
        });
    });
    leg.target = node->inode();
    Made(what, [&] { node->GiveToTarget(); });
    Finish(&leg);
}

void Transfer::MakeLink(const std::string& text, const Place& to) {
    const std::string what =
        "cannot create symbolic link " + Quoted(to.path()) + " to " + Quoted(text);
    if (DryRun()) {
        const int error = to.Status() ? EEXIST : WhyNoNewFile(*to.directory);
        if (error != 0) throw Refusal(what, error);
        constexpr mode_t kAll = S_IRWXU | S_IRWXG | S_IRWXO;
        Foreseen::Come(to, Foreseen::StatusOfNew(*to.directory, S_IFLNK | kAll));
    } else if (::symlinkat(text.c_str(), to.directory->fd(), to.name.c_str()) != 0) {
        throw Refusal(what, errno);
    }
    NoteMade(to, StatusOf(to));
}

// One more name for what has been copied before. False when it has not, or cannot have that name,
// or would take the metadata of the first one with it.
bool Transfer::CopyName(Leg* leg, Links links) {
    RequireUnlockedTarget(*leg);
    const struct stat& info = leg->source->info();
    const auto first = first_names_.find(IdOf(info));
    // A file that has the number of one that has gone is another one.
    if (links == Links::kNone || first == first_names_.end() ||
        !SameState(first->second.source, info)) {
        return false;
    }
    const Place& there = first->second.to;
    if (!SharesMetadata(first->second.from, there, *leg)) {
        leg->wanted.strays.push_back(
            {"being one file with " + Printable(there.path()),
             "names of one file have one metadata there, and here each has its own",
             {}});
        return false;
    }
    const auto what = [&] {
        return "cannot create hard link " + Quoted(leg->to.path()) + " to " + Quoted(there.path());
    };
    if (DryRun()) {
        const bool impossible = StatusOf(there).st_dev != leg->to.place.directory->Status().st_dev;
        if (impossible) return false;
        Made(what, [&] { ForeseeLink(leg, there); });
        leg->is_link = true;
        return true;
    }
    const auto node = TemporaryNode::TryToMake(leg->to.place, [&](int directory, const char* name) {
        return ::linkat(there.directory->fd(), there.name.c_str(), directory, name, 0);
    });
    const int error = errno;
    const bool impossible = !node && (error == EXDEV || error == EMLINK || error == EPERM ||
                                      error == ENOTSUP || error == ENOENT);
    if (impossible) return false;
    if (!node) throw Refusal(what(), error);
    leg->target = node->inode();
    leg->is_link = true;
    Made(what, [&] { node->GiveToTarget(); });
    return true;
}

void Transfer::TakeForCopy(const Place& from, const Place& to, Links links) {
    Leg leg = LegFor(from, to);
    const auto there = first_names_.find(IdOf(leg.source->info()));
    const bool known = there != first_names_.end();
    if (known && SameFile(StatusOf(there->second.to), StatusOf(to))) return;
    if (known && CopyName(&leg, links)) return Finish(&leg);
    RememberName(leg, links);
}

void Transfer::RememberName(const Leg& leg, Links links) {
    const struct stat& info = leg.source->info();
    if (links == Links::kAll || (links == Links::kSeveral && info.st_nlink > 1)) {
        first_names_.insert_or_assign(IdOf(info), FirstName{leg.to.place, info, leg.from.place});
    }
}

// Owner, mode, ACL and attributes, as far as they are kept.
void Transfer::CopyInodeTo(const Leg& leg, int source, int target) const {
    if (options_.manner.metadata_only) return;
    // Until the end the owner can change it, and give it attributes.
    const auto open_to_owner = [&](const struct stat& now) {
        if (!HoldsContents(leg.source->info())) return;
        const mode_t mode = now.st_mode & kPermissionBits;
        const mode_t least = S_ISDIR(leg.source->info().st_mode) ? S_IRWXU : S_IRUSR | S_IWUSR;
        if ((mode & least) != least) leg.target->SetMode(mode | least);
    };
    open_to_owner(leg.target->info());
    const auto problem = CopyPermissions(
        {leg.source, source}, {leg.target, target}, options_.manner, [&](const std::string& name) {
            const bool stays = leg.added && options_.merging == Merging::kKeeps;
            return !TravelsAsMetadata(name, leg.from, leg.to) &&
                   !(stays && leg.target->Attribute(name));
        });
    if (problem) options_.on_note(Printable(leg.to.path()) + ": " + *problem);
    if (BeginsClosed(options_.manner)) open_to_owner(leg.target->Status());
}

// What is wanted of a directory that is there: all that it has, and some more.
void Transfer::MergeInto(Leg* leg) const {
    if (leg->to.keeping() == Keeping::kNone || leg->to.is_root()) return;
    Metadata all =
        ReadMetadata(leg->to, *leg->target, Sidecars::Find(leg->to, Sidecars::Services::kFind));
    const bool yields = options_.merging == Merging::kKeeps;
    Metadata& wanted = leg->wanted;
    Metadata readable = wanted;
    DropDamaged(&readable);
    leg->added = NamesOfItems(readable);
    std::vector<std::string> differing;
    bool changes = Combine(readable, yields ? Wins::kThere : Wins::kOther, &all, &differing);
    for (const Metadata::ServiceFile& service : wanted.services) {
        leg->added->push_back(NameOfAttribute(service.name) + " of another service");
        const auto there = std::find_if(
            all.services.begin(), all.services.end(),
            [&](const Metadata::ServiceFile& one) { return one.name == service.name; });
        if (there == all.services.end()) {
            all.services.push_back(service);
        } else if (yields || SameContent(there->value, service.value)) {
            continue;
        } else {
            *there = service;
        }
        changes = true;
    }
    const auto mark = [&](bool is_set, bool* there) {
        if (yields || !is_set || *there) return;
        *there = true;
        changes = true;
    };
    mark(wanted.locked, &all.locked);
    mark(wanted.hidden, &all.hidden);
    mark(wanted.system, &all.system);
    if (wanted.created && wanted.created != all.created && !(yields && all.created)) {
        all.created = wanted.created;
        changes = true;
    }
    if (changes) RequireRewritable(leg->to, all);
    leg->stays = !changes;
    all.ForgetFiles();
    all.strays = std::move(wanted.strays);
    all.problems = std::move(wanted.problems);
    all.earlier = std::move(wanted.earlier);
    wanted = std::move(all);
}

// All that comes once the data is in its place. Mode and times are right also when the metadata
// could not be copied.
void Transfer::Finish(Leg* leg) {
    const Manner& manner = options_.manner;
    NoteMade(leg->to.place, leg->target->info());
    volumes_.try_emplace(leg->target->info().st_dev, leg->to.place.directory);
    const bool holds = HoldsContents(leg->source->info()) && !leg->is_link;
    const FinalMode mode = holds ? FinalModeOf(*leg, manner) : FinalMode{0};
    NoteOrphan(*leg);
    const bool keeps = leg->to.keeping() != Keeping::kNone;
    std::vector<Missing> missing;
    Arrival arrival;
    std::optional<Failure> failure;
    if (keeps && !leg->to.is_root() && !leg->stays) {
        WriteOptions write = {.durability = Durability::kLater,
                              .is_new = !leg->former_mode && !leg->is_link};
        if (holds) write.mode = mode.locks ? mode.mode & ~kWriteBits : mode.mode;
        try {
            arrival.fitting = FitTo(*leg, &missing);
            arrival.written =
                WriterFor(leg->to).Write(leg->to, *leg->target, arrival.fitting, write);
        } catch (const Failure& problem) {
            failure = problem;
        }
    }
    if (holds && mode.locks) {
        LockMode(*leg->target, mode.mode);
    } else if (holds && (leg->target->Status().st_mode & kPermissionBits) != mode.mode) {
        leg->target->SetMode(mode.mode);
    }
    if (manner.keeps_times && !leg->is_link) SetTimes(*leg);
    ReportNew(leg->to.place.location(), leg->source->info().st_mode);
    if (DryRun() && !failure && S_ISDIR(leg->target->info().st_mode)) {
        Foreseen::NoteFinished(leg->target->info());
    }
    if (failure) {
        throw Incomplete(kFailed, leg->from.path(),
                         "its metadata could not be copied: " + std::string(failure->what()),
                         "see what is in the way, and copy it again");
    }
    if (leg->stays) {
        AddUnreadable(*leg, {}, &missing);
    } else if (keeps) {
        const bool yields = leg->added && options_.merging == Merging::kKeeps;
        if (!yields) leg->own_attributes.AddWrittenOver(arrival.fitting, &missing);
        AddWhatDidNotArrive(*leg, std::move(arrival), &missing);
    } else {
        AddUnkept(*leg, &missing);
    }
    NoteCopied(*leg);
    if (!missing.empty()) {
        throw Loss(kFailed, leg->from.path(),
                   "not all of its metadata arrived at " + Printable(leg->to.path()) + ": " +
                       Joined(missing),
                   "keep the original, or take the rest along by hand");
    }
    NoteUnseen(*leg);
    for (const std::string& path : leg->wanted.earlier) {
        options_.on_note(Printable(leg->to.path()) +
                         ": has in the current layout what an earlier version kept in " +
                         Printable(path));
    }
}

void Transfer::NoteUnseen(const Leg& leg) const {
    for (const Metadata::Attribute& attribute : leg.wanted.attributes) {
        const std::uint64_t size = attribute.value.size();
        const auto note = NoteOfUnseen(leg.to, attribute.name, size);
        // It tells nothing new where it was not seen before.
        if (note && !NoteOfUnseen(leg.from, attribute.name, size)) options_.on_note(*note);
    }
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
    Remember(HashOf(leg.source->info()));
    for (const Sidecars::Found& file : leg.sidecars.Files()) Remember(HashOf(file.info));
    if (const auto& file = leg.sidecars.apple_double; file && file->info.st_nlink == 1) {
        Remember(HashAsMetadata(leg.from.place.name, file->info));
    }
}

void Transfer::Remember(std::uint64_t hash) {
    copied_.push_back(hash);
    sorted_ = false;
}

bool Transfer::Remembers(std::uint64_t hash) {
    if (!sorted_) std::sort(copied_.begin(), copied_.end());
    sorted_ = true;
    return std::binary_search(copied_.begin(), copied_.end(), hash);
}

void Transfer::NoteMade(const Place& to, const struct stat& info) {
    made_apple_double_ = made_apple_double_ || to.name.starts_with(AppleDoubleName({}));
    if (S_ISLNK(info.st_mode)) made_links_.insert(IdOf(info));
    if (to.directory->is_new()) return;
    made_[to.directory.get()].insert_or_assign(IdOf(info), to.name);
}

// Under which name this has made in its directory what is at a place now; none when it has not.
std::optional<std::string> Transfer::NameOfMade(const Place& to) const {
    const auto info = to.Status();
    if (!info) return std::nullopt;
    // All that is in a directory that is new has been made here.
    if (to.directory->is_new()) return to.directory->NameOf(*info, to.name);
    const auto directory = made_.find(to.directory.get());
    if (directory == made_.end()) return std::nullopt;
    const auto found = directory->second.find(IdOf(*info));
    if (found == directory->second.end()) return std::nullopt;
    // Another name of the file is no other spelling of the one that was made.
    const bool other = found->second != to.name && to.directory->NameOf(*info, to.name) == to.name;
    return other ? std::nullopt : std::optional(found->second);
}

bool Transfer::HasMadeLink(const Place& to) const {
    if (made_links_.empty()) return false;
    const auto info = to.Status();
    return info && S_ISLNK(info->st_mode) && made_links_.contains(IdOf(*info));
}

void Transfer::RequireMayCome(const Leg& leg) const {
    RequireSeen(leg);
    RequireNoMetadata(leg.from.place, leg.to);
    if (leg.replaces) RequireNotMade(leg.from.place, leg.to.place);
}

// One file cannot be both: an object that was copied, and metadata of another one.
void Transfer::RequireNoMetadata(const Place& from, const Object& target) const {
    const Place& to = target.place;
    const Keeping keeping = target.keeping();
    if (keeping != Keeping::kAppleDouble && keeping != Keeping::kEaDirectory) return;
    const Directory& there = *to.directory;
    const auto was_made = [&](const std::string& name) {
        return NameOfMade({to.directory, name}) == name;
    };
    const std::string prefix = AppleDoubleName({});
    const bool is_prefixed = to.name.starts_with(prefix);
    std::string object = is_prefixed ? to.name.substr(prefix.size()) : std::string();
    if (NamesMetadata(there, object, target.type)) object.clear();  // which has none of its own
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

void Transfer::RequireNoMetadataAt(const Place& to, const Place& from) const {
    const bool may_be = to.name == kEaDirName || to.name.starts_with(AppleDoubleName({}));
    const auto there = may_be ? to.Status() : std::nullopt;
    if (!there) return;
    const Object target = TargetAt(to, there->st_mode & S_IFMT);
    if (!NamesMetadata(*to.directory, to.name, target.type)) return;
    throw Failure(kFailed, from.path(), "its place is that of metadata: " + Quoted(to.path()),
                  "give it another name");
}

void Transfer::RequireNotMade(const Place& from, const Place& to) const {
    const auto made = NameOfMade(to);
    if (!made) return;
    const bool directory = S_ISDIR(StatusOf(to).st_mode);
    if (*made == to.name && directory) return;
    if (*made == to.name) {
        throw Refusal(
            "will not overwrite just-created " + Quoted(to.path()) + " with " + Quoted(from.path()),
            "give it another name");
    }
    // The file system takes the two for one.
    throw Failure(kFailed, from.path(),
                  "its name is the same as that of '" + Printable(to.directory->PathOf(*made)) +
                      "', just made, there",
                  "give it another name");
}

DirectoryRef Transfer::MakeDirectory(const Place& from, const Place& to) {
    RequireNoMetadata(from, TargetAt(to, S_IFDIR));
    RequireNotMade(from, to);
    if (DirectoryRef there = to.directory->FindIn(to.name)) {
        const struct stat info = there->Status();
        NoteMade(to, info);
        volumes_.try_emplace(info.st_dev, there);
        return there;
    }
    const mode_t least = S_IRWXU;
    const mode_t mode = FirstMode(StatusOf(from), options_.manner) | least;
    DirectoryRef made = Made([&] { return "cannot create directory " + Quoted(to.path()); },
                             [&] { return to.directory->MakeIn(to.name, mode); });
    const struct stat info = made->Status();
    NoteMade(to, info);
    volumes_.try_emplace(info.st_dev, made);
    return made;
}

void Transfer::FinishDirectory(const Place& from, const Directory& inside, const Place& to,
                               const DirectoryRef& made, bool is_new) {
    made_.erase(made.get());
    Leg leg = LegFor(from, to);
    const auto opened = [](const Directory& directory) {
        return Inode::Of(std::make_shared<const File>(directory.Reopened()));
    };
    leg.source = opened(inside);
    leg.target = made->foreseen() ? Inode::Foresee(to, made->Status()) : opened(*made);
    if (!SameFile(StatusOf(to), leg.target->info())) throw HasBecomeAnother(to);
    if (!is_new) leg.former_mode = leg.target->info().st_mode & kPermissionBits;
    std::exception_ptr failure;
    for (const Directory::Entry& entry : inside.Entries()) {
        if (!S_ISDIR(entry.type) || !IsMetadata(inside, entry, leg.from.type)) continue;
        try {
            CopyLeftOvers(inside, made, entry);
        } catch (const Failure&) {
            failure = std::current_exception();
        }
    }
    if (is_new || options_.merging == Merging::kReplaces) {
        RemoveFormerAttributes(leg);
    } else {
        MergeInto(&leg);
    }
    CopyInodeTo(leg, -1, -1);
    Finish(&leg);
    if (made->foreseen() && options_.manner.keeps_times) {
        struct stat info = leg.target->info();
        info.st_mtim = leg.source->info().st_mtim;
        Foreseen::Come(to, info);
    }
    if (failure) std::rethrow_exception(failure);
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
                    Remember(HashOf(info));
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
    NoteMade(to, StatusOf(to));
    return true;
}

void Transfer::ForgetMade() {
    made_.clear();
    made_links_.clear();
    made_apple_double_ = false;
}

void Transfer::MakeDurable() {
    for (const auto& [device, directory] : volumes_) directory->SyncVolume();
}

bool Transfer::WasCopied(const struct stat& info) {
    // The change time of a file with several names changes when one of them goes.
    return Remembers(HashOf(info, true)) || Remembers(HashOf(info, false));
}

bool Transfer::WasMetadata(const std::string& object, const struct stat& info) {
    return info.st_nlink == 1 && Remembers(HashAsMetadata(object, info));
}

}  // namespace mavoea::tool

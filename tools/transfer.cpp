#include "tools/transfer.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <optional>
#include <random>
#include <string_view>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tools/carry.h"
#include "tools/messages.h"
#include "tools/permissions.h"
#include "tools/text.h"
#include "tools/volume.h"
#include "util/volume_kind.h"

namespace mavoea::tool {
namespace {

constexpr mode_t kPermissions = 07777;
constexpr mode_t kWritable = 0222;

struct stat StatusOf(const std::string& path) {
    struct stat info;
    if (::lstat(path.c_str(), &info) != 0) throw SystemFailure(path, errno);
    return info;
}

bool HoldsContents(const struct stat& info) {
    return S_ISREG(info.st_mode) || S_ISDIR(info.st_mode);
}

std::string ParentOf(const std::string& path) {
    const std::size_t slash = path.rfind('/');
    return slash == 0 ? "/" : path.substr(0, slash);
}

Object ObjectAt(const std::string& path) { return {path, MAVOGetFSType(path.c_str(), 1)}; }

// ---- New files ----------------------------------------------------------------------------------

// A name that is used by nothing else in the directory of `target`; it goes away at the end of its
// scope, unless it has been given to the target.
class TemporaryName {
 public:
    explicit TemporaryName(const std::string& target) : target_(target) {}
    ~TemporaryName() {
        if (made_) (void)::unlink(path_.c_str());
    }
    TemporaryName(const TemporaryName&) = delete;
    TemporaryName& operator=(const TemporaryName&) = delete;

    // `make` makes a file of that name and returns a negative value when it cannot. Returns what
    // `make` did.
    template <class Make>
    int TryToMakeBy(Make make) {
        constexpr int kAttempts = 100;
        for (int attempt = 1;; ++attempt) {
            path_ = ParentOf(target_) + "/.mavoea-" + RandomLetters();
            const int made = make(path_.c_str());
            made_ = made >= 0;
            if (made_ || errno != EEXIST || attempt == kAttempts) return made;
        }
    }

    template <class Make>
    int MakeBy(Make make) {
        const int made = TryToMakeBy(make);
        if (made < 0) throw SystemFailure(target_, errno);
        return made;
    }

    // A descriptor of a new file, which the caller closes.
    int MakeFile() {
        return MakeBy([](const char* path) {
            return ::open(path, O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, S_IRUSR | S_IWUSR);
        });
    }

    // The target is replaced in one step.
    void GiveToTarget() {
        if (::rename(path_.c_str(), target_.c_str()) != 0) throw SystemFailure(target_, errno);
        // Two names of one file are left as they are.
        (void)::unlink(path_.c_str());
        made_ = false;
    }

    const std::string& path() const { return path_; }

 private:
    static std::string RandomLetters() {
        static std::random_device random;
        constexpr std::string_view kLetters = "abcdefghijklmnopqrstuvwxyz0123456789";
        std::uniform_int_distribution<std::size_t> letter(0, kLetters.size() - 1);
        std::string text(8, 'x');
        for (char& c : text) c = kLetters[letter(random)];
        return text;
    }

    const std::string& target_;
    std::string path_;
    bool made_ = false;
};

// Where the permissions say whether a file is locked, the library has set all their write bits or
// none. What they were is put back where it says the same.
mode_t FinalMode(const struct stat& source, const struct stat& now, const Object& to) {
    const mode_t mode = source.st_mode & kPermissions;
    if (to.keeping() != Keeping::kAppleDouble && to.keeping() != Keeping::kXattr) return mode;
    if ((now.st_mode & kWritable) == 0) return mode & ~kWritable;
    const bool unlocked = (now.st_mode & kWritable) == kWritable;
    return unlocked && (mode & kWritable) == 0 ? mode | S_IWUSR : mode;
}

}  // namespace

bool IsMetadataName(const std::string& name, const struct stat& info) {
    if (S_ISDIR(info.st_mode)) return name == "@eaDir";
    return name.starts_with("._") && S_ISREG(info.st_mode);
}

Transfer::Transfer(TransferOptions options)
    : options_(std::move(options)), watch_{options_.on_bytes, options_.give_up} {}

// The destination need not be there for its volume's type to be known.
Transfer::Leg Transfer::LegFor(const std::string& from, const std::string& to) {
    Leg leg = {ObjectAt(from), ObjectAt(to), StatusOf(from)};
    if (HasMetadata(leg.from)) RequirePlace(leg.from, leg.to);
    return leg;
}

void Transfer::CopyObject(const std::string& from, const std::string& to) {
    Leg leg = LegFor(from, to);
    if (CopyName(leg)) return;
    if (S_ISREG(leg.info.st_mode)) {
        CopyFile(&leg, false);
    } else {
        CopyNode(leg);
    }
    if (leg.info.st_nlink > 1) copies_[{leg.info.st_dev, leg.info.st_ino}] = to;
}

void Transfer::CopyContents(const std::string& from, const std::string& to) {
    Leg leg = LegFor(from, to);
    CopyFile(&leg, true);
}

void Transfer::CopyFile(Leg* leg, bool stream) {
    constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK | O_NOFOLLOW;
    const std::string& from = leg->from.path;
    const File source(::open(from.c_str(), kFlags), from);
    if (source.fd() < 0 || ::fstat(source.fd(), &leg->info) != 0) throw SystemFailure(from, errno);
    if (!stream && !S_ISREG(leg->info.st_mode)) {
        throw Failure(kFailed, from, "it has become another file", "copy it again");
    }
    TemporaryName temporary(leg->to.path);
    {
        const File target(temporary.MakeFile(), leg->to.path);
        if (stream) {
            CopyStream(source, target, watch_);
        } else {
            CopyData(source, target, watch_);
        }
    }
    CopyInode(*leg, temporary.path());
    temporary.GiveToTarget();
    Finish(*leg);
}

void Transfer::CopyNode(const Leg& leg) {
    const std::string& to = leg.to.path;
    // The library follows links, and opens what it is given: what lies beside such an object is
    // copied while there is a plain file in its place.
    const bool has_sidecar = HasSidecar(leg.from);
    if (has_sidecar) {
        TemporaryName placeholder(to);
        ::close(placeholder.MakeFile());
        placeholder.GiveToTarget();
    }
    if (HasSidecar(leg.to)) RemoveMetadata(leg.to, IndexReport::kNo);
    if (has_sidecar) CopyMetadata(leg.from, leg.to);

    TemporaryName temporary(to);
    if (S_ISLNK(leg.info.st_mode)) {
        std::string text(static_cast<std::size_t>(PATH_MAX), '\0');
        const ssize_t size = ::readlink(leg.from.path.c_str(), text.data(), text.size());
        if (size < 0) throw SystemFailure(leg.from.path, errno);
        text.resize(static_cast<std::size_t>(size));
        temporary.MakeBy([&](const char* path) { return ::symlink(text.c_str(), path); });
    } else {
        temporary.MakeBy([&](const char* path) {
            return ::mknod(path, (leg.info.st_mode & S_IFMT) | S_IRUSR | S_IWUSR, leg.info.st_rdev);
        });
    }
    CopyInode(leg, temporary.path());
    CopyTimes(leg.info, temporary.path());
    temporary.GiveToTarget();
    if (!has_sidecar) ReportNew(to);
}

// One more name for what has been copied before. False when it has not, or cannot have that name.
bool Transfer::CopyName(const Leg& leg) {
    if (leg.info.st_nlink < 2) return false;
    const auto first = copies_.find({leg.info.st_dev, leg.info.st_ino});
    if (first == copies_.end()) return false;
    TemporaryName temporary(leg.to.path);
    const auto make = [&](const char* path) {
        return ::linkat(AT_FDCWD, first->second.c_str(), AT_FDCWD, path, 0);
    };
    if (temporary.TryToMakeBy(make) < 0) return false;
    temporary.GiveToTarget();
    if (S_ISREG(leg.info.st_mode)) {
        Finish(leg);
    } else {
        ReportNew(leg.to.path);
    }
    return true;
}

// What the inode has. The owner of a file or directory can still change it.
void Transfer::CopyInode(const Leg& leg, const std::string& to) {
    const mode_t mode = leg.info.st_mode;
    const auto problem = CopyPermissions(leg.from.path, leg.info, to, [&](const std::string& name) {
        return !TravelsAsMetadata(name, leg.from, leg.to);
    });
    if (problem) options_.on_note(Printable(leg.to.path) + ": " + *problem);
    if (!HoldsContents(leg.info)) return;
    const mode_t least = S_ISDIR(mode) ? S_IRWXU : S_IRUSR | S_IWUSR;
    if ((mode & least) != least) (void)::chmod(to.c_str(), (mode & kPermissions) | least);
}

// All that comes once the data is in its place. Mode and times are right also when the metadata
// could not be copied.
void Transfer::Finish(const Leg& leg) {
    const std::string& to = leg.to.path;
    std::optional<Failure> failure;
    try {
        if (HasSidecar(leg.to)) RemoveMetadata(leg.to, IndexReport::kNo);
        CopyMetadata(leg.from, leg.to);
    } catch (const Failure& problem) {
        failure = problem;
    }
    const struct stat now = StatusOf(to);
    struct stat wanted = leg.info;
    // Nobody gets another user's rights by a copy of his program.
    if (now.st_uid != wanted.st_uid || now.st_gid != wanted.st_gid) {
        wanted.st_mode &= ~static_cast<mode_t>(S_ISUID | S_ISGID);
    }
    const mode_t mode = failure ? wanted.st_mode & kPermissions : FinalMode(wanted, now, leg.to);
    if ((now.st_mode & kPermissions) != mode) (void)::chmod(to.c_str(), mode);
    CopyTimes(leg.info, to);
    if (failure) throw Failure(*failure);
}

bool Transfer::MakeDirectory(const std::string& from, const std::string& to) {
    (void)LegFor(from, to);
    if (::mkdir(to.c_str(), S_IRWXU) == 0) return true;
    if (errno != EEXIST) throw SystemFailure(to, errno);
    if (!S_ISDIR(StatusOf(to).st_mode)) throw SystemFailure(to, ENOTDIR);
    return false;
}

void Transfer::FinishDirectory(const std::string& from, const std::string& to) {
    const Leg leg = {ObjectAt(from), ObjectAt(to), StatusOf(from)};
    RemoveInodeMetadata(leg.to);
    CopyInode(leg, to);
    Finish(leg);
}

bool Transfer::Rename(const std::string& from, const std::string& to) {
    const struct stat info = StatusOf(from);
    const Object source = ObjectAt(from);
    const Object target = ObjectAt(to);
    if (VolumeKindOf(source.type) != VolumeKindOf(target.type)) return false;
    const bool has_sidecar = HasSidecar(source);
    if (has_sidecar) RequirePlace(source, target);
    struct stat there;
    const bool replaces = ::lstat(to.c_str(), &there) == 0;

    if (::rename(from.c_str(), to.c_str()) != 0) {
        if (errno == EXDEV) return false;
        throw SystemFailure(from, errno);
    }
    // Two names of one file are left as they are.
    if (replaces && there.st_dev == info.st_dev && there.st_ino == info.st_ino) {
        (void)::unlink(from.c_str());
    }
    const auto take_back = [&] { return !replaces && ::rename(to.c_str(), from.c_str()) == 0; };
    try {
        // Nothing of another object may be taken for what belongs to this one.
        if (HasSidecar(target)) RemoveMetadata(target, IndexReport::kNo);
        if (has_sidecar && HasSidecar(target)) {
            throw Failure(kFailed, from,
                          "something is in the way of its metadata at " + Printable(to),
                          "see mavoea where PATH, and move it away");
        }
    } catch (const Failure&) {
        (void)take_back();
        throw;
    }
    if (!has_sidecar && !HoldsContents(info)) {
        ReportRenamed(from, to);
        return true;
    }
    try {
        RenameMetadata(source, target);
    } catch (const Failure&) {
        if (take_back()) {
            EAIndexFlags quiet = {0, 0};
            (void)MAVOEARename(to.c_str(), from.c_str(), source.type, &quiet);
        }
        throw;
    }
    return true;
}

}  // namespace mavoea::tool

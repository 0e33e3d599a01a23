#include "tools/move/ends.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "tools/place/dry_run.h"
#include "tools/place/volume.h"
#include "tools/say/job.h"
#include "tools/say/messages.h"

namespace mavoea::tool {
namespace {

namespace fs = std::filesystem;

// Whether a link may be followed: the superuser follows no other user's, who could have put it
// there for a file that was named.
bool IsTrusted(const struct stat& link) { return ::geteuid() != 0 || link.st_uid == 0; }

Refusal CannotStat(const Place& place, int error) {
    return {"cannot stat " + Quoted(place.path()), error};
}

struct stat Followed(const Place& place) {
    struct stat info;
    if (::fstatat(place.directory->fd(), place.name.c_str(), &info, 0) != 0) {
        throw CannotStat(place, errno);
    }
    return info;
}

// The place to which a link leads, under the link's name. None where that is no place, as with a
// pipe behind a descriptor.
std::optional<Place> Resolved(const Place& link, const struct stat& info) {
    std::error_code error;
    const fs::path resolved = fs::canonical(link.directory->ProcPath(link.name), error);
    if (error) return std::nullopt;
    Place place = PlaceOf(resolved.string(), Shown::kWhole);
    place.shown = link.path();
    const auto there = place.Status();
    if (!there || !SameFile(*there, info)) return std::nullopt;
    return place;
}

}  // namespace

Source FindSource(const Place& from, bool follows) {
    const auto own = from.Status();
    if (!own) throw CannotStat(from, ENOENT);
    Source source = {from, *own, from, *own, nullptr};
    if (!S_ISLNK(own->st_mode) || !follows) return source;
    if (!IsTrusted(*own)) {
        throw Failure(kFailed, from.path(),
                      "a symbolic link of another user, which the superuser does not follow",
                      "name what it leads to, or copy the link with -P");
    }
    source.info = Followed(from);
    if (!S_ISREG(source.info.st_mode) && !S_ISDIR(source.info.st_mode)) return source;
    if (const auto place = Resolved(from, source.info)) {
        source.place = *place;
    } else {
        OpenStream(&source);
    }
    return source;
}

void OpenStream(Source* source) {
    const Place& place = source->place;
    // Whoever feeds a FIFO is waited for. A link has been found worth following, and nothing else
    // is read that may have come since.
    const int usual = O_CLOEXEC | O_NOCTTY | (source->followed() ? 0 : O_NOFOLLOW);
    if (DryRun() && ::faccessat(place.directory->fd(), place.name.c_str(), R_OK, AT_EACCESS) != 0) {
        throw Refusal("cannot open " + Quoted(place.path()) + " for reading", errno);
    }
    const int flags = usual | (DryRun() ? O_PATH : O_RDONLY);
    auto file = std::make_unique<File>(::openat(place.directory->fd(), place.name.c_str(), flags),
                                       place.path());
    if (file->fd() < 0) {
        throw Refusal("cannot open " + Quoted(place.path()) + " for reading", errno);
    }
    if (!SameFile(file->Status(), source->info)) throw HasBecomeAnother(place);
    source->stream = std::move(file);
}

Target FindTarget(const Place& to, bool follows, bool loops_go) {
    Target target = {to, to};
    // What this has made is not followed.
    if (to.directory->foreseen() || Foreseen::Find(*to.directory, to.name) != nullptr) {
        target.own = target.info = to.Status();
        return target;
    }
    struct stat info;
    const int fd = to.directory->fd();
    if (::fstatat(fd, to.name.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0) {
        if (errno == ENOENT) return target;
        throw CannotStat(to, errno);
    }
    target.own = target.info = info;
    if (!S_ISLNK(info.st_mode) || !follows) return target;
    if (!IsTrusted(info)) {
        target.replaced = true;
        return target;
    }
    if (::fstatat(fd, to.name.c_str(), &info, 0) != 0) {
        if (errno == ELOOP && loops_go) {
            target.replaced = true;
            return target;
        }
        if (errno != ENOENT) throw CannotStat(to, errno);
        target.info.reset();
        target.dangling = true;
        return target;
    }
    target.info = info;
    if (!S_ISREG(info.st_mode)) return target;
    if (const auto place = Resolved(to, info)) target.place = *place;
    return target;
}

namespace {

// In the place of one that would be open for writing.
std::unique_ptr<const File> OpenedInDryRun(const Place& place) {
    if (const int error = WhyNoWriting(place)) {
        throw Refusal("cannot create regular file " + Quoted(place.path()), error);
    }
    return std::make_unique<const File>(-1, place.path());
}

}  // namespace

std::unique_ptr<const File> OpenTarget(const Target& target) {
    if (DryRun()) return OpenedInDryRun(target.place);
    constexpr int kFlags = O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    const Place& place = target.place;
    const auto open = [&](int flags) {
        return std::make_unique<File>(
            ::openat(place.directory->fd(), place.name.c_str(), flags | kFlags), place.path());
    };
    auto file = open(O_RDWR);
    // What may be written only is written all the same.
    if (file->fd() < 0 && errno == EACCES) file = open(O_WRONLY);
    if (file->fd() < 0) throw Refusal("cannot create regular file " + Quoted(place.path()), errno);
    if (!SameFile(file->Status(), *target.info)) throw HasBecomeAnother(place);
    return file;
}

std::unique_ptr<const File> OpenSpecialTarget(const Target& target) {
    const Place& place = target.named;
    if (DryRun()) return OpenedInDryRun(place);
    const int flags = O_WRONLY | O_NOCTTY | O_CLOEXEC | (target.is_link() ? 0 : O_NOFOLLOW);
    auto file = std::make_unique<File>(::openat(place.directory->fd(), place.name.c_str(), flags),
                                       place.path());
    if (file->fd() < 0) throw Refusal("cannot create regular file " + Quoted(place.path()), errno);
    // A regular file that has come there since would lose what is in it.
    if (!SameFile(file->Status(), *target.info)) throw HasBecomeAnother(place);
    return file;
}

bool SamePlace(const Place& one, const Place& other) {
    return one.name == other.name && SameFile(one.directory->Status(), other.directory->Status());
}

bool IsInside(const Place& place, const struct stat& directory) {
    if (const auto info = place.Status(); info && SameFile(*info, directory)) return true;
    int fd = ::fcntl(place.directory->OnDisk().fd(), F_DUPFD_CLOEXEC, 0);
    for (;;) {
        const File at(fd, place.path());
        if (fd < 0) throw SystemFailure(place.path(), errno);
        const struct stat info = at.Status();
        if (SameFile(info, directory)) return true;
        fd = ::openat(at.fd(), "..", O_PATH | O_DIRECTORY | O_CLOEXEC);
        struct stat above;
        if (fd >= 0 && ::fstat(fd, &above) == 0 && SameFile(above, info)) {
            ::close(fd);
            return false;
        }
    }
}

std::optional<struct stat> StatusBehind(const std::string& path) {
    struct stat info;
    if (::stat(path.c_str(), &info) == 0) return info;
    if (errno == ENOENT) return std::nullopt;
    throw SystemFailure(path, errno);
}

std::string LastName(std::string path) {
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path.substr(path.rfind('/') + 1);
}

}  // namespace mavoea::tool

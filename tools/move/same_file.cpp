#include "tools/move/same_file.h"

#include <fcntl.h>

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "tools/place/volume.h"

namespace mavoea::tool {
namespace {

bool IsLink(const struct stat& info) { return S_ISLNK(info.st_mode); }

std::optional<struct stat> Behind(const Place& place, const struct stat& own) {
    if (!IsLink(own)) return own;
    struct stat info;
    if (::fstatat(place.directory->fd(), place.name.c_str(), &info, 0) == 0) return info;
    return std::nullopt;
}

// Whether the entry that a link leads to in the end is the one at `to`.
bool LeadsTo(const Place& link, const Place& to) {
    std::error_code error;
    const auto path = std::filesystem::canonical(link.directory->ProcPath(link.name), error);
    const bool dangles = error == std::errc::no_such_file_or_directory ||
                         error == std::errc::too_many_symbolic_link_levels;
    if (dangles) return false;
    return error || SamePlace(PlaceOf(path.string(), Shown::kWhole), to);
}

// One entry under two spellings, on a file system that ignores case.
bool IsRespelled(const Place& from, const Place& to, const struct stat& info) {
    if (SamePlace(from, to)) return false;
    return S_ISDIR(info.st_mode) || !(IsListed(from) && IsListed(to));
}

}  // namespace

Sameness CompareEnds(const Source& source, const Target& target, Task task,
                     const CopyOptions& options, bool follows) {
    const bool moves = task == Task::kMove;
    const bool same = SameFile(source.info, *target.info);
    const bool one_entry = SamePlace(source.named, target.named);
    if (same && options.hard_links) return Sameness::kNothing;
    if (follows && !same) return Sameness::kApart;

    // The entries themselves, where links have been followed.
    const struct stat& from = follows ? source.own : source.info;
    const struct stat& to = follows ? *target.own : *target.info;
    const bool same_entries = SameFile(from, to);
    const bool links = IsLink(from) && IsLink(to);
    if (links && !follows) {
        if (one_entry) return Sameness::kSame;
        if (options.backup != Backup::kNone || !same) return Sameness::kApart;
        return moves ? Sameness::kSame : Sameness::kNothing;
    }
    if (links && options.remove_destination) return Sameness::kApart;

    if (options.backup != Backup::kNone) {
        if (same_entries) return one_entry ? Sameness::kSame : Sameness::kApart;
        // A backup of what a link leads to leaves the link dangling.
        const bool dangles = !moves && follows && IsLink(from) && !IsLink(to);
        return dangles ? Sameness::kSame : Sameness::kApart;
    }
    if (moves || options.remove_destination) {
        if (IsLink(to)) return Sameness::kApart;
        if (moves && same_entries && IsRespelled(source.named, target.named, to)) {
            return Sameness::kApart;
        }
        // Of two names of a file one is lost by a move, and made anew by a copy.
        if (same_entries && to.st_nlink > 1 && !one_entry) {
            return moves ? Sameness::kSame : Sameness::kApart;
        }
    }
    if (!IsLink(from) && !IsLink(to) && !same_entries) return Sameness::kApart;
    // A link may replace its referent while that has another name.
    if (moves && IsLink(source.info) && to.st_nlink > 1) {
        return LeadsTo(source.named, target.named) ? Sameness::kSame : Sameness::kApart;
    }
    if (options.symbolic_links && IsLink(to)) return Sameness::kApart;
    if (follows) return Sameness::kSame;
    const auto behind_from = Behind(source.named, from);
    const auto behind_to = Behind(target.named, to);
    if (!behind_from || !behind_to || !SameFile(*behind_from, *behind_to)) return Sameness::kApart;
    if (!options.hard_links) return Sameness::kSame;
    return IsLink(to) ? Sameness::kApart : Sameness::kNothing;
}

}  // namespace mavoea::tool

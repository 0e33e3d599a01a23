// The two ends of a copy: what is copied, and what is where it is to go.
#ifndef MAVOEA_TOOLS_MOVE_ENDS_H_
#define MAVOEA_TOOLS_MOVE_ENDS_H_

#include <memory>
#include <optional>
#include <string>

#include "tools/place/directory.h"

namespace mavoea::tool {

// What is copied, symbolic links followed or not.
struct Source {
    Place named;       // the entry that led to it
    struct stat own;   // of that
    Place place;       // of the object itself
    struct stat info;  // of the object itself
    std::unique_ptr<const File>
        stream;  // what is no regular file, or has no name, is read from here

    bool followed() const { return S_ISLNK(own.st_mode) && !S_ISLNK(info.st_mode); }
    bool is_directory() const { return S_ISDIR(info.st_mode); }
};

// All of them throw Failure, in the words of cp.
Source FindSource(const Place& from, bool follows);
// Opens what is to be read and not made anew.
void OpenStream(Source* source);

// What is at the place where something is to go.
struct Target {
    Place named;                           // the entry
    Place place;                           // what it leads to, or the entry itself
    std::optional<struct stat> own = {};   // of the entry, none when nothing is there
    std::optional<struct stat> info = {};  // of the place
    bool dangling = false;                 // a link that leads nowhere
    bool replaced = false;                 // what is there goes, whatever it is

    bool is_directory() const { return info && S_ISDIR(info->st_mode); }
    bool is_link() const { return own && S_ISLNK(own->st_mode); }
};

// `loops_go`: a link that leads to itself is as good as any file that cannot be opened.
Target FindTarget(const Place& to, bool follows, bool loops_go);

// Opens a regular file that is written over. Failure with errno's words in cp's.
std::unique_ptr<const File> OpenTarget(const Target& target);
// The same for what is no regular file, such as a FIFO, whose reader is waited for.
std::unique_ptr<const File> OpenSpecialTarget(const Target& target);

// One entry of one directory.
bool SamePlace(const Place& one, const Place& other);

// Whether something is, or would be, `directory` or below it.
bool IsInside(const Place& place, const struct stat& directory);

// What a path leads to, links followed. None when there is nothing; a Failure of its own otherwise.
std::optional<struct stat> StatusBehind(const std::string& path);

// Without trailing slashes.
std::string LastName(std::string path);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_ENDS_H_

// Objects, the types of their volumes, and where those keep metadata.
#ifndef MAVOEA_TOOLS_PLACE_VOLUME_H_
#define MAVOEA_TOOLS_PLACE_VOLUME_H_

#include <string>
#include <string_view>
#include <vector>

#include "tools/place/dialect.h"
#include "tools/place/directory.h"
#include "tools/say/json.h"
#include "tools/say/messages.h"
#include "util/volume_kind.h"

namespace mavoea::tool {

// How volumes of a type keep metadata. Those of other programs count by what lies beside an object.
enum class Keeping { kAppleDouble, kEaDirectory, kXattr, kNone };
Keeping KeepingOf(int type);

struct Object {
    Place place;
    int type = -1;          // of its volume, -1 unknown
    bool declared = false;  // by somebody, and not found by the filesystem

    std::string path() const { return place.path(); }  // absolute, for people
    Keeping keeping() const { return KeepingOf(type); }
    VolumeKind kind() const { return VolumeKindOf(type); }
    const Dialect* dialect() const { return DialectOf(type); }
    bool is_root() const { return place.name == "."; }
};

// How people are shown a path that somebody gave.
enum class Shown { kWhole, kAsGiven };  // absolute

// Where somebody's path leads: what comes before its last name is the kernel's to follow, and so is
// a link with a slash behind it. Throws Failure, with the path as it was given.
Place PlaceOf(const std::string& path, Shown shown);

// The object at a path that somebody gave. Failure when nothing is there; a dangling symbolic link
// is something.
Object FindObject(const std::string& path);

// An object in an open directory, or one that is to come there. `info`: its status, null when there
// is nothing yet.
Object ObjectAt(const Place& place, const struct stat* info);
// One that is there, and of that type, S_IFREG for instance. Volumes are directories: the type of
// the one that all else in a directory is on is found once.
Object ObjectAt(const Place& place, mode_t type);

// What a volume that is only copied to holds is read as it will be by those who copied.
int ReadableType(int type);
Object AsReadable(Object object);

// The type that a person calls so; `option` is what a Failure is about. Throws Failure.
int TypeFromName(const std::string& type_name, const std::string& option);

std::string_view TypeName(int type);
// "1"; "samba" for those that have no number.
std::string TypeId(int type);
Json TypeJson(int type);

// A directory's volume type for this run, from "PATH=TYPE". Only the host's platform library can be
// told. Throws Failure, also when there is no such directory.
void DeclareVolume(std::string_view declaration);

// What is at `path`, or will be, is on a volume of that type; `option` is what a Failure is about.
// Returns the type.
int DeclareType(const std::string& path, const std::string& type_name, const std::string& option);

// Failure when the host's table of volumes has a line that means nothing.
void RequireVolumeTable();

// What decided on the type of `object`'s volume.
std::string TypeSource(const Object& object);

// What to say about an object whose volume keeps no metadata that the library can reach.
Failure NoStore(const Object& object);

// Metadata beside the object takes a directory in which it is.
void RequireParent(const Object& object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_VOLUME_H_

// What lies beside an object and belongs to it: names and statuses only, nothing is read.
#ifndef MAVOEA_TOOLS_STORE_SIDECARS_H_
#define MAVOEA_TOOLS_STORE_SIDECARS_H_

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/content.h"

namespace mavoea::tool {

inline constexpr const char* kEaDirName = "@eaDir";
inline constexpr const char* kCoverName = ".cover";

// By the lists of the object's directory and its EA directory, where those have been taken: what
// comes later may be missed, and what has gone is not there.
struct Sidecars {
    // Whether a file is known to be the "._" file of the object of that name in its directory.
    using IsKnown = std::function<bool(const std::string& object, const struct stat&)>;

    struct Found {
        DirectoryRef directory;
        std::string name;
        struct stat info;
        WholeFile file = {};  // for those that have been opened already

        std::string path() const { return directory->PathOf(name); }
        bool regular() const { return S_ISREG(info.st_mode); }
    };
    struct Service {
        Found found;
        std::string name;  // "@KIND", or "/NAME" in the folder of the object's name
    };

    // Looking for what other services keep takes a list of the whole EA directory, which is taken
    // anyway where the object's directory has been listed.
    enum class Services { kLeaveOut, kFind };

    // Throws Failure. An "@eaDir" that is a symbolic link, or may not be looked into, is a
    // `problem`. What `is_known` to be the object's "._" file is not opened to see that it is one.
    static Sidecars Find(const Object& object, Services services, const IsKnown& is_known = {});

    DirectoryRef ea_dir;  // null: there is none, or volumes of the type have no use for one
    std::optional<Found> stream;
    std::optional<Found> resource;
    std::optional<Found> resource_copy;  // of a repair that is under way, or was cut short
    std::optional<Found> apple_double;   // a valid "._" file

    DirectoryRef folder;  // of earlier versions, and of other services
    std::vector<Found> attribute_files;
    std::optional<Found> legacy_resource;
    std::vector<Found> reserved;  // "MAVO:KIND" in it, which has another name in the current layout

    std::vector<Service> services;  // regular files; those in the folder are always among them
    std::vector<Found> others;      // links, pipes and the like, in the place of any of these
    std::optional<Failure> problem;

    bool Any() const;
    // Whether anything in the EA directory would be taken for another object's of a like name.
    bool AnyByName() const { return stream || resource || resource_copy || !services.empty(); }
    // All files, and links and the like, the folder's last.
    std::vector<Found> Files() const;
};

// How names of metadata files in the EA directory begin for an object of that name.
std::string NameInEaDirectory(const std::string& name);

// "._NAME"; empty where that is too long for a name.
std::string AppleDoubleName(const std::string& name);

// Whether `name` is a valid "._" file of version 2. Throws Failure.
bool IsAppleDouble(const Directory& directory, const std::string& name);
// The file, if it is one; null when it is not. A Failure for what is no regular file.
WholeFile FindAppleDouble(const Directory& directory, const std::string& name);

// Whether an entry of a directory is metadata of an object in it, on volumes of that type: "@eaDir"
// and "._" files whose object is there; metadata has none. Throws Failure.
bool IsMetadata(const Directory& directory, const Directory::Entry& entry, int type);
// The same of what has that name; false when nothing has.
bool NamesMetadata(const Directory& directory, const std::string& name, int type);

// What in a directory is an object or may be one, as it was listed first: sorted by name, and what
// has the name of a "._" file behind all others, that of such a file's behind that. Throws Failure.
std::vector<Directory::Entry> CandidatesIn(const DirectoryRef& directory);
// Whether one of these is an object. Of a "._" file it is asked when its turn comes: the work on
// the object that it belongs to has looked into it by then, and nobody has to do so again; or that
// has gone, and it with that. Throws Failure.
bool IsObject(const DirectoryRef& directory, const Directory::Entry& candidate);

// All that are objects, in the same order. Throws Failure.
std::vector<Directory::Entry> ObjectsIn(const DirectoryRef& directory);

// Whether a name is so long that its metadata may have the names of another object's.
bool MayShareNames(const std::string& name);

// Another object of the directory whose metadata would have the same names in the EA directory.
std::optional<std::string> SharesNames(const Place& place);

// Failure when there is one, and `sidecars` says that something has such a name.
void RequireOwnNames(const Object& object, const Sidecars& sidecars);
// The same before anything is written.
void RequireOwnNames(const Object& object);

// The objects in `directory` of whose metadata an entry of its EA directory may have the name.
std::vector<std::string> MayBelongTo(const Directory& directory, const std::string& name);
bool BelongsToAnObject(const Directory& directory, const std::string& name);

// Something in an EA directory that belongs to no object.
struct LeftOver {
    Sidecars::Found found;
    std::string path;  // below the EA directory
};
// All such files, and links and the like; a ".cover" is none, nor is what this tool has given a
// name of its own. Throws Failure.
std::vector<LeftOver> FindLeftOver(const Directory& directory, const Directory& ea_dir);

// Removes an "@eaDir" in which nothing is left but a ".cover".
void RemoveEaDirectoryIfEmpty(const Directory& directory);

// From here on that leaves it where it is, for processes that work beside others in one directory:
// one of those may be about to write into it. It is removed when all have ended.
void LeaveEmptyEaDirectories();
// Whether one has been left since this was last asked.
bool TakeLeftEaDirectory();
// Removes it after all, whatever the directory's list says.
void RemoveLeftEaDirectory(const Directory& directory);

// The EA directory, made where it is missing; for that the process becomes the superuser for a
// moment, if it may. Throws Failure. Null where a dry run would have made it.
DirectoryRef NeedEaDirectory(const Directory& directory);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_SIDECARS_H_

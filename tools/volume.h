// Objects, the types of their volumes, and where those keep metadata.
#ifndef MAVOEA_TOOLS_VOLUME_H_
#define MAVOEA_TOOLS_VOLUME_H_

#include <string>
#include <string_view>
#include <vector>

namespace mavoea::tool {

// How volumes of a type keep metadata.
enum class Keeping { kAppleDouble, kEaDirectory, kXattr, kNone };

struct Object {
    std::string path;  // absolute, without a trailing '/'
    int type = -1;     // of its volume, -1 unknown

    Keeping keeping() const;
};

// The object at `path`. Failure when nothing is there; a dangling symbolic link is something.
Object FindObject(const std::string& path);

// What to say about an object whose volume keeps no metadata that the library can reach.
std::string_view TypeName(int type);

// A directory's volume type for this run, from "PATH=TYPE". Only the host's platform library can be
// told. Throws Failure.
struct Declaration {
    std::string directory;  // absolute
    int type = -1;
};
Declaration DeclareVolume(std::string_view declaration);
// The same for a type as TYPE names it; `option` is what a Failure is about.
Declaration DeclareVolume(const std::string& directory, const std::string& type_name,
                          const std::string& option);

// Where the type of `object` came from, as far as `declarations` tell.
std::string TypeSource(const Object& object, const std::vector<Declaration>& declarations);

struct MetadataPath {
    const char* id;       // "stream", for programs
    const char* label;    // "EA stream", for people
    std::string path;     // empty: it cannot have one
    std::string problem;  // why it cannot
};

// Every place where metadata of the object may lie, whatever its volume's type.
std::vector<MetadataPath> MetadataPaths(const Object& object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_VOLUME_H_

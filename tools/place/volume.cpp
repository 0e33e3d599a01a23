#include "tools/place/volume.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <filesystem>
#include <map>

#include "platform/include/mavocore.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

namespace fs = std::filesystem;

// By the directory's normalized path: what --volume said, as it was given.
std::map<std::string, std::string>& Declared() {
    static std::map<std::string, std::string> declared;
    return declared;
}

std::string WithoutSlashes(std::string path) {
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path;
}

// As text: symbolic links are not looked at.
std::string Normalized(const std::string& path) {
    return WithoutSlashes(fs::absolute(path).lexically_normal().string());
}

bool HasDotDot(const std::string& path) {
    for (const fs::path& component : fs::path(path)) {
        if (component == "..") return true;
    }
    return false;
}

// Where the kernel says that a directory is.
std::string RealPath(const std::string& path) {
    const File file(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC), path);
    if (file.fd() < 0) throw SystemFailure(path, errno);
    std::array<char, PATH_MAX> text{};
    const std::string link = "/proc/self/fd/" + std::to_string(file.fd());
    const ssize_t size = ::readlink(link.c_str(), text.data(), text.size());
    if (size < 0) throw SystemFailure(path, errno);
    return {text.data(), static_cast<std::size_t>(size)};
}

Place RootPlace() { return {Directory::Open("/", "/", "/"), "."}; }

int TypeOfFileSystem(const Place& place, bool is_directory) {
#if MAVOEA_HOST_PLATFORM
    const Directory& directory = place.directory->OnDisk();
    const bool asks_it = is_directory && !place.directory->foreseen();
    return MAVOGetFSType((asks_it ? directory.ProcPath(place.name) : directory.ProcPath()).c_str(),
                         1);
#else
    (void)is_directory;
    return MAVOGetFSType(place.location().c_str(), 1);
#endif
}

#if MAVOEA_HOST_PLATFORM
// What a type may be; behind that, ways of Samba's that none is for.
constexpr const char* kTypes =
    "take a number from 0 to 12, appledouble, eadir, fileea, xattr, samba, samba-stream, "
    "samba-all-streams, netatalk, netatalk-samba or linux; Samba's streams_depot and "
    "\"fruit:resource = xattr\" are not known";

constexpr const char* kDeclareVolume =
    "declare it with --volume PATH=TYPE or in " MAVO_VOLUME_TABLE;
#else
constexpr const char* kDeclareVolume = "move the object to another volume";
#endif

}  // namespace

Keeping KeepingOf(int type) {
    if (const Dialect* const dialect = DialectOf(type)) {
        return dialect->fork == Dialect::Fork::kAppleDouble ? Keeping::kAppleDouble
                                                            : Keeping::kXattr;
    }
    switch (VolumeKindOf(type)) {
        case VolumeKind::kAppleDouble:
            return Keeping::kAppleDouble;
        case VolumeKind::kEADir:
        case VolumeKind::kFileEA:
            return Keeping::kEaDirectory;
        case VolumeKind::kAttribute:
            return Keeping::kXattr;
        case VolumeKind::kDestinationOnly:
        case VolumeKind::kNone:
            break;
    }
    return Keeping::kNone;
}

Place PlaceOf(const std::string& path, Shown shown) {
    if (path.empty()) throw Failure(kFailed, "PATH", "it is empty", "name a file or directory");
    const std::string given = WithoutSlashes(path);
    const std::size_t slash = given.rfind('/');
    const std::string name = given.substr(slash + 1);
    const auto called = [&](Place place) {
        if (shown == Shown::kAsGiven) place.shown = given;
        return place;
    };
    if (given == "/") return RootPlace();
    if (name == "." || name == "..") {
        const std::string real = RealPath(path);
        return called(real == "/" ? RootPlace() : PlaceOf(real, Shown::kWhole));
    }
    const std::string parent = slash == std::string::npos ? "."
                               : slash == 0               ? "/"
                                                          : given.substr(0, slash);
    try {
        const std::string location = HasDotDot(parent) ? RealPath(parent) : Normalized(parent);
        const std::string prefix = given.substr(0, slash == std::string::npos ? 0 : slash + 1);
        const Place place = {
            Directory::Open(parent, shown == Shown::kAsGiven ? prefix : location, location), name};
        // Behind a slash the kernel follows a link.
        struct stat info;
        const bool follows =
            path != given &&
            ::fstatat(place.directory->fd(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0 &&
            S_ISLNK(info.st_mode);
        return follows ? called(PlaceOf(RealPath(path), Shown::kWhole)) : place;
    } catch (const SystemFailure& failure) {
        throw SystemFailure(path, failure.error());
    } catch (const fs::filesystem_error& failure) {  // the working directory has gone
        throw SystemFailure(path, failure.code().value());
    }
}

Object FindObject(const std::string& path) {
    const Place place = PlaceOf(path, Shown::kWhole);
    struct stat info;
    if (::fstatat(place.directory->fd(), place.name.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0) {
        throw SystemFailure(path, errno);
    }
    return ObjectAt(place, &info);
}

Object ObjectAt(const Place& place, const struct stat* info) {
#if MAVOEA_HOST_PLATFORM
    MAVOVolumeEntry entry;
    if (MAVOVolumeFind(place.location().c_str(), &entry) == 1) return {place, entry.type, true};
    constexpr bool kDeclared = false;
#else
    constexpr bool kDeclared = true;  // the platform knows its volumes
#endif
    return {place, TypeOfFileSystem(place, info != nullptr && S_ISDIR(info->st_mode)), kDeclared};
}

Object ObjectAt(const Place& place, mode_t type) {
    // The destination of a conversion may be declared, and be a file.
    const bool is_volume =
        S_ISDIR(type) || (!Declared().empty() && Declared().contains(place.location()));
    if (is_volume) {
        struct stat info = {};
        info.st_mode = type;
        return ObjectAt(place, &info);
    }
    std::optional<Directory::VolumeType>& kept = place.directory->volume_type();
    if (!kept) {
        const Object object = ObjectAt(place, nullptr);
        kept = {object.type, object.declared};
    }
    return {place, kept->type, kept->declared};
}

int ReadableType(int type) {
    constexpr int kEaDirectoryType = 1;
    return VolumeKindOf(type) == VolumeKind::kDestinationOnly ? kEaDirectoryType : type;
}

Object AsReadable(Object object) {
    object.type = ReadableType(object.type);
    return object;
}

std::string TypeId(int type) {
    const Dialect* const dialect = DialectOf(type);
    return dialect != nullptr ? std::string(dialect->name) : std::to_string(type);
}

Json TypeJson(int type) { return DialectOf(type) != nullptr ? Json(TypeId(type)) : Json(type); }

int TypeFromName(const std::string& type_name, const std::string& option) {
#if MAVOEA_HOST_PLATFORM
    const int type = MAVOVolumeTypeFromName(type_name.c_str());
    if (type >= 0) return type;
    throw Failure(kFailed, option, "unknown volume type \"" + type_name + "\"", kTypes);
#else
    (void)type_name;
    throw Failure(kFailed, option, "this system knows its volumes", "leave the option out");
#endif
}

std::string_view TypeName(int type) {
    if (const Dialect* const dialect = DialectOf(type)) return dialect->title;
    switch (VolumeKindOf(type)) {
        case VolumeKind::kAppleDouble:
            return "AppleDouble";
        case VolumeKind::kEADir:
            return "EA directory";
        case VolumeKind::kFileEA:
            return "file EA";
        case VolumeKind::kAttribute:
            return "extended attributes";
        case VolumeKind::kDestinationOnly:
            return "copy destination only";
        case VolumeKind::kNone:
            break;
    }
    return "unknown";
}

void DeclareVolume(std::string_view declaration) {
    const std::string option = "--volume " + std::string(declaration);
#if MAVOEA_HOST_PLATFORM
    const std::size_t equals = declaration.rfind('=');
    if (equals == std::string_view::npos || equals == 0) {
        throw Failure(kFailed, option, "not of the form PATH=TYPE",
                      "for example --volume /srv/share=eadir");
    }
    const std::string directory(declaration.substr(0, equals));
    const std::string type_name(declaration.substr(equals + 1));
    TypeFromName(type_name, option);
    struct stat info;
    if (::stat(directory.c_str(), &info) != 0) {
        throw Failure(kFailed, option, SystemFailure::Words(errno),
                      "name a directory that is there");
    }
    if (!S_ISDIR(info.st_mode)) {
        throw Failure(kFailed, option, "it is not a directory", "name a directory that is there");
    }
    (void)DeclareType(directory, type_name, option);
#else
    throw Failure(kFailed, option, "this system knows its volumes", "leave the option out");
#endif
}

int DeclareType(const std::string& path, const std::string& type_name, const std::string& option) {
#if MAVOEA_HOST_PLATFORM
    const int type = TypeFromName(type_name, option);
    const std::string directory = Normalized(path);
    if (MAVOVolumeDeclare(directory.c_str(), type) != 0) throw SystemFailure(option, errno);
    Declared()[directory] = "--volume " + Printable(directory) + '=' + type_name;
    return type;
#else
    (void)path;
    (void)type_name;
    throw Failure(kFailed, option, "this system knows its volumes", "leave the option out");
#endif
}

void RequireVolumeTable() {
#if MAVOEA_HOST_PLATFORM
    int line = 0;
    const char* problem = nullptr;
    const int found = MAVOVolumeTableCheck(&line, &problem);
    if (found < 0) {
        throw Failure(kFailed, MAVO_VOLUME_TABLE, SystemFailure::Words(errno), "mend or remove it");
    }
    if (found == 0) return;
    throw Failure(kFailed, std::string(MAVO_VOLUME_TABLE) + ':' + std::to_string(line), problem,
                  std::string("mend the line; for a type, ") + kTypes);
#endif
}

std::string TypeSource(const Object& object) {
#if MAVOEA_HOST_PLATFORM
    MAVOVolumeEntry entry;
    const std::string path = object.place.location();
    if (MAVOVolumeFind(path.c_str(), &entry) != 1) return "the filesystem";
    if (entry.source == MAVO_VOLUME_LISTED) {
        return std::string(MAVO_VOLUME_TABLE) + ", line " + std::to_string(entry.line);
    }
    std::string nearest;
    std::size_t longest = 0;
    for (const auto& [directory, option] : Declared()) {
        const std::string prefix = directory == "/" ? directory : directory + '/';
        if ((path != directory && !path.starts_with(prefix)) || directory.size() < longest) {
            continue;
        }
        longest = directory.size();
        nearest = option;
    }
    return nearest;
#else
    (void)object;
    return "the platform";
#endif
}

Failure NoStore(const Object& object) {
    if (object.type < 0) {
        return {kFailed, object.path(), "the type of its volume is unknown", kDeclareVolume};
    }
    return {kFailed, object.path(), "volumes of type " + TypeId(object.type) + " keep no metadata",
            kDeclareVolume};
}

void RequireParent(const Object& object) {
    if (!object.is_root()) return;
    throw Failure(kFailed, object.path(), "the root has no directory to keep metadata in",
                  "name something below it");
}

}  // namespace mavoea::tool

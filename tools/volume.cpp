#include "tools/volume.h"

#include <sys/stat.h>

#include <cerrno>
#include <filesystem>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tools/messages.h"
#include "util/volume_kind.h"

namespace mavoea::tool {
namespace {

// Symbolic links are not looked at: metadata lies beside the name that was given.
std::string Absolute(const std::string& path) {
    std::string absolute = std::filesystem::absolute(path).lexically_normal().string();
    while (absolute.size() > 1 && absolute.back() == '/') absolute.pop_back();
    return absolute;
}

MetadataPath Derived(const char* id, const char* label, const Object& object, int form,
                     const char* kind, int place) {
    MetadataPath result{id, label, std::string(MAVOEA_PATH_SIZE + 1, '\0'), {}};
    const ErrorMark mark;
    const int failed = kind == nullptr ? MAVOEADirPath(form, object.path.c_str(),
                                                       result.path.data(), MAVOEA_PATH_SIZE)
                                       : MAVOEAPath(form, object.path.c_str(), kind,
                                                    result.path.data(), MAVOEA_PATH_SIZE, place);
    if (failed == 0) {
        result.path.resize(result.path.find('\0'));
        return result;
    }
    result.path.clear();
    result.problem = mark.Get().code == MAVOEA_ERR_NAME_TOO_LONG ? "the name is too long for it"
                                                                 : "it cannot be derived";
    return result;
}

}  // namespace

Keeping Object::keeping() const {
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

Object FindObject(const std::string& path) {
    if (path.empty()) throw Failure(kFailed, "PATH", "it is empty", "name a file or directory");
    Object object{Absolute(path), -1};
    struct stat info;
    if (::lstat(object.path.c_str(), &info) != 0) throw SystemFailure(path, errno);
    object.type = MAVOGetFSType(object.path.c_str(), 1);
    return object;
}

std::string_view TypeName(int type) {
    switch (type) {
        case 0:
        case 5:
            return "AppleDouble";
        case 1:
        case 3:
        case 6:
        case 10:
            return "EA directory";
        case 2:
            return "file EA";
        case 7:
            return "extended attributes";
        case 12:
            return "copy destination only";
        default:
            return "unknown";
    }
}

Declaration DeclareVolume(std::string_view declaration) {
    const std::string subject = "--volume " + std::string(declaration);
#if MAVOEA_HOST_PLATFORM
    const std::size_t equals = declaration.rfind('=');
    if (equals == std::string_view::npos || equals == 0) {
        throw Failure(kFailed, subject, "not of the form PATH=TYPE",
                      "for example --volume /srv/share=eadir");
    }
    return DeclareVolume(std::string(declaration.substr(0, equals)),
                         std::string(declaration.substr(equals + 1)), subject);
#else
    throw Failure(kFailed, subject, "this system knows its volumes", "leave the option out");
#endif
}

Declaration DeclareVolume(const std::string& directory, const std::string& type_name,
                          const std::string& option) {
#if MAVOEA_HOST_PLATFORM
    Declaration result{Absolute(directory), MAVOVolumeTypeFromName(type_name.c_str())};
    if (result.type < 0) {
        throw Failure(kFailed, option, "unknown volume type \"" + type_name + "\"",
                      "take a number from 0 to 12, appledouble, eadir, fileea or xattr");
    }
    if (MAVOVolumeDeclare(result.directory.c_str(), result.type) != 0) {
        throw SystemFailure(option, errno);
    }
    return result;
#else
    (void)directory;
    (void)type_name;
    throw Failure(kFailed, option, "this system knows its volumes", "leave the option out");
#endif
}

std::string TypeSource(const Object& object, const std::vector<Declaration>& declarations) {
    const Declaration* nearest = nullptr;
    for (const Declaration& declaration : declarations) {
        const std::string& directory = declaration.directory;
        const std::string prefix = directory == "/" ? directory : directory + '/';
        if (object.path != directory && !object.path.starts_with(prefix)) continue;
        if (nearest == nullptr || directory.size() >= nearest->directory.size()) {
            nearest = &declaration;
        }
    }
    if (nearest != nullptr && nearest->type == object.type) return "--volume";
#if MAVOEA_HOST_PLATFORM
    return std::string(MAVO_VOLUME_TABLE) + " or the file system";
#else
    return "the platform";
#endif
}

std::vector<MetadataPath> MetadataPaths(const Object& object) {
    return {
        Derived("stream", "EA stream", object, EA_FORM_FILE, MAVOEA_KIND_STREAM, EA_PLACE_EADIR),
        Derived("resource", "resource file", object, EA_FORM_FILE, MAVOEA_KIND_RESOURCE,
                EA_PLACE_EADIR),
        Derived("legacyFolder", "legacy folder", object, EA_FORM_FOLDER, nullptr, EA_PLACE_EADIR),
        Derived("legacyResource", "legacy resource file", object, EA_FORM_FOLDER,
                MAVOEA_KIND_LEGACY_RESOURCE, EA_PLACE_EADIR),
        Derived("appleDouble", "AppleDouble file", object, EA_FORM_FILE, MAVOEA_KIND_STREAM,
                EA_PLACE_APPLEDOUBLE),
    };
}

}  // namespace mavoea::tool

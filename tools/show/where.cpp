#include "tools/show/where.h"

#include <sys/stat.h>

#include <iostream>
#include <vector>

#include "include/mavoea.h"
#include "tools/place/volume.h"
#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

struct MetadataPlace {
    const char* id;       // "stream", for programs
    const char* label;    // "EA stream", for people
    std::string path;     // empty: it cannot have one
    std::string problem;  // why it cannot
    std::optional<struct stat> info;
};

// Every place where metadata of the object may lie, whatever its volume's type.
std::vector<MetadataPlace> PlacesOf(const Object& object) {
    const Directory& directory = *object.place.directory;
    const std::string& name = object.place.name;
    const DirectoryRef ea_dir = directory.FindIn(kEaDirName);
    const std::string prefix = directory.PathOf(kEaDirName) + '/';
    const auto in_ea_dir = [&](const char* id, const char* label, const std::string& in) {
        MetadataPlace place = {id, label, prefix + in, {}, {}};
        if (ea_dir) place.info = ea_dir->StatusOf(in);
        return place;
    };
    const std::string derived = NameInEaDirectory(name);
    std::vector<MetadataPlace> places = {
        in_ea_dir("stream", "EA stream", derived + "@" MAVOEA_KIND_STREAM),
        in_ea_dir("resource", "resource file", derived + "@" MAVOEA_KIND_RESOURCE),
        in_ea_dir("legacyFolder", "legacy folder", name)};
    MetadataPlace legacy = {"legacyResource",
                            "legacy resource file",
                            prefix + name + "/" MAVOEA_KIND_LEGACY_RESOURCE,
                            {},
                            {}};
    if (places.back().info && S_ISDIR(places.back().info->st_mode)) {
        legacy.info = ea_dir->OpenIn(name)->StatusOf(MAVOEA_KIND_LEGACY_RESOURCE);
    }
    places.push_back(legacy);
    MetadataPlace apple_double = {"appleDouble", "AppleDouble file", {}, {}, {}};
    if (const std::string file = AppleDoubleName(name); file.empty()) {
        apple_double.problem = "the name is too long for it";
    } else {
        apple_double.path = directory.PathOf(file);
        apple_double.info = directory.StatusOf(file);
    }
    places.push_back(apple_double);
    return places;
}

Json PlaceJson(const MetadataPlace& place) {
    Json entry;
    entry.Set("kind", place.id);
    if (place.path.empty()) {
        entry.Set("path", Json());
        entry.Set("problem", place.problem);
    } else {
        entry.SetText("path", place.path);
        if (place.info && S_ISREG(place.info->st_mode)) entry.Set("size", place.info->st_size);
    }
    entry.Set("exists", place.info.has_value());
    return entry;
}

std::string PlaceText(const MetadataPlace& place) {
    std::string text = std::string("  ") + place.label + ": ";
    if (place.path.empty()) return text + "none, " + place.problem + '\n';
    text += Printable(place.path) + (place.info ? " (exists" : " (missing");
    if (place.info && S_ISREG(place.info->st_mode)) {
        text += ", " + std::to_string(place.info->st_size) + " bytes";
    }
    return text + ")\n";
}

}  // namespace

ExitStatus Where(const std::string& path, bool json) {
    const Object object = FindObject(path);
    const std::string source = TypeSource(object);
    const std::vector<MetadataPlace> places = PlacesOf(object);
    const std::optional<Sign> sign = FindSign(object.place);
    const auto inode = Inode::Open(object.place);
    const std::string depot =
        FindDepot(object, inode.get(),
                  inode->HoldsContents() ? inode->AttributeNames() : std::vector<std::string>());
    if (json) {
        Json result;
        result.SetText("path", object.path());
        result.Set("type", TypeJson(object.type));
        result.Set("typeName", TypeName(object.type));
        result.Set("typeSource", source);
        Json files = Json::Array();
        for (const MetadataPlace& place : places) files.Add(PlaceJson(place));
        result.Set("files", std::move(files));
        if (sign) {
            result.Set("found", Json::Object({{"type", sign->dialect->name}, {"by", sign->text}}));
        }
        if (!depot.empty()) result.SetText("unknownStreams", depot);
        Print(result);
    } else {
        std::cout << Printable(object.path()) << "\n  volume type: " << TypeId(object.type) << ", "
                  << TypeName(object.type) << " (" << source << ")\n";
        for (const MetadataPlace& place : places) std::cout << PlaceText(place);
        if (sign) {
            std::cout << "  other programs: " << sign->dialect->title << ", by " << sign->text
                      << "; --volume PATH=" << sign->dialect->name << " declares it\n";
        }
        if (!depot.empty()) {
            std::cout << "  other programs: Samba, with streams_depot, by " << Printable(depot)
                      << "; this is not known, and nothing is written beside it\n";
        }
    }
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    return kSuccess;
}

}  // namespace mavoea::tool

#include "tools/store.h"

#include "format/ea_stream.h"
#include "platform/include/mavocore.h"

namespace mavoea::tool {
namespace {

#if MAVOEA_HOST_PLATFORM
constexpr const char* kDeclareVolume =
    "declare it with --volume PATH=TYPE or in " MAVO_VOLUME_TABLE;
#else
constexpr const char* kDeclareVolume = "move the object to another volume";
#endif

}  // namespace

std::unique_ptr<Store> OpenStore(const Object& object) {
    switch (object.keeping()) {
        case Keeping::kAppleDouble:
        case Keeping::kEaDirectory:
            if (object.path == "/") {
                throw Failure(kFailed, object.path, "the root has no directory to keep metadata in",
                              "name something below it");
            }
            return MakeEaFileStore(object);
        case Keeping::kXattr:
            return MakeXattrStore(object);
        case Keeping::kNone:
            break;
    }
    throw NoStore(object);
}

void CheckFinderInfoSize(const std::string& path, const Bytes& value) {
    if (value.size() == kFinderInfoSize) return;
    throw Failure(kFailed, path,
                  "Finder info has " + std::to_string(kFinderInfoSize) + " bytes, the value has " +
                      std::to_string(value.size()),
                  "give all of them, as with --hex and 64 digits");
}

Failure NoStore(const Object& object) {
    if (object.type < 0) {
        return {kFailed, object.path, "the type of its volume is unknown", kDeclareVolume};
    }
    return {kFailed, object.path,
            "volumes of type " + std::to_string(object.type) + " keep no metadata", kDeclareVolume};
}

}  // namespace mavoea::tool

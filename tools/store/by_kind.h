// One class for each kind of place that keeps metadata.
#ifndef MAVOEA_TOOLS_STORE_BY_KIND_H_
#define MAVOEA_TOOLS_STORE_BY_KIND_H_

#include "tools/place/volume.h"

namespace mavoea::tool {

// The only object of the class that is for volumes of that kind; null where they keep no metadata.
template <class Base, class AppleDouble, class EaDirectory, class FileEa, class Attributes>
const Base* OneFor(VolumeKind kind) {
    static const AppleDouble apple_double;
    static const EaDirectory ea_directory;
    static const FileEa file_ea;
    static const Attributes attributes;
    switch (kind) {
        case VolumeKind::kAppleDouble:
            return &apple_double;
        case VolumeKind::kEADir:
        case VolumeKind::kDestinationOnly:
            return &ea_directory;
        case VolumeKind::kFileEA:
            return &file_ea;
        case VolumeKind::kAttribute:
            return &attributes;
        case VolumeKind::kNone:
            break;
    }
    return nullptr;
}

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_BY_KIND_H_

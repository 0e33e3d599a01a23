// What the filesystem types of volumes mean for where metadata lives.
#ifndef MAVOEA_UTIL_VOLUME_KIND_H_
#define MAVOEA_UTIL_VOLUME_KIND_H_

namespace mavoea {

enum class VolumeKind {
    kNone,             // keeps no metadata that the library knows of
    kAppleDouble,      // "._" files
    kEADir,            // the EA directory
    kFileEA,           // the EA directory, and real extended attributes of the object
    kAttribute,        // real extended attributes
    kDestinationOnly,  // the EA directory, of the destination of a copy
};

// Of a type as MAVOGetFSType() gives it, -1 included.
constexpr VolumeKind VolumeKindOf(int type) {
    switch (type) {
        case 0:
        case 5:
            return VolumeKind::kAppleDouble;
        case 1:
        case 3:
        case 6:
        case 10:
            return VolumeKind::kEADir;
        case 2:
            return VolumeKind::kFileEA;
        case 7:
            return VolumeKind::kAttribute;
        case 12:
            return VolumeKind::kDestinationOnly;
        default:
            return VolumeKind::kNone;
    }
}

}  // namespace mavoea

#endif  // MAVOEA_UTIL_VOLUME_KIND_H_

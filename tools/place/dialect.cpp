#include "tools/place/dialect.h"

#include "platform/include/mavocore.h"

namespace mavoea::tool {
namespace {

#if MAVOEA_HOST_PLATFORM
constexpr Dialect kSamba = {.name = "samba",
                            .program = "Samba",
                            .title = "Samba, with netatalk's records",
                            .finder_info = Dialect::FinderInfo::kRecord,
                            .names = Dialect::Names::kStream,
                            .fork = Dialect::Fork::kAppleDouble,
                            .marks = Dialect::Marks::kDosAttributes};
constexpr Dialect kSambaStream = {.name = "samba-stream",
                                  .program = "Samba",
                                  .title = "Samba, with streams",
                                  .finder_info = Dialect::FinderInfo::kStream,
                                  .names = Dialect::Names::kStream,
                                  .fork = Dialect::Fork::kAppleDouble,
                                  .marks = Dialect::Marks::kDosAttributes};
constexpr Dialect kSambaAllStreams = {.name = "samba-all-streams",
                                      .program = "Samba",
                                      .title = "Samba, with streams for forks as well",
                                      .finder_info = Dialect::FinderInfo::kStream,
                                      .names = Dialect::Names::kStream,
                                      .fork = Dialect::Fork::kAttribute,
                                      .marks = Dialect::Marks::kDosAttributes};
constexpr Dialect kNetatalk = {.name = "netatalk",
                               .program = "netatalk",
                               .title = "netatalk",
                               .finder_info = Dialect::FinderInfo::kRecord,
                               .names = Dialect::Names::kPlain,
                               .fork = Dialect::Fork::kAppleDouble,
                               .marks = Dialect::Marks::kRecord};
constexpr Dialect kNetatalkSamba = {.name = "netatalk-samba",
                                    .program = "netatalk",
                                    .title = "netatalk, with attributes as Samba's",
                                    .finder_info = Dialect::FinderInfo::kRecord,
                                    .names = Dialect::Names::kPlainWithNul,
                                    .fork = Dialect::Fork::kAppleDouble,
                                    .marks = Dialect::Marks::kRecord};
#endif
constexpr Dialect kLinux = {.name = "linux",
                            .program = "another program",
                            .title = "attributes as they are",
                            .finder_info = Dialect::FinderInfo::kAttribute,
                            .names = Dialect::Names::kPlain,
                            .fork = Dialect::Fork::kAttribute,
                            .marks = Dialect::Marks::kHost};

}  // namespace

const Dialect* DialectOf(int type) {
#if MAVOEA_HOST_PLATFORM
    switch (type) {
        case MAVO_VOLUME_SAMBA:
            return &kSamba;
        case MAVO_VOLUME_SAMBA_STREAM:
            return &kSambaStream;
        case MAVO_VOLUME_SAMBA_ALL_STREAMS:
            return &kSambaAllStreams;
        case MAVO_VOLUME_NETATALK:
            return &kNetatalk;
        case MAVO_VOLUME_NETATALK_SAMBA:
            return &kNetatalkSamba;
        case MAVO_VOLUME_LINUX:
            return &kLinux;
        default:
            return nullptr;
    }
#else
    (void)type;
    return nullptr;
#endif
}

const Dialect& AnyDialect() { return kLinux; }

}  // namespace mavoea::tool

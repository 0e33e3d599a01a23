// Attributes by whose names other programs keep what is known of an object: one byte of an input of
// foreign_object_fuzz chooses one.
#ifndef MAVOEA_FUZZ_FOREIGN_NAMES_H_
#define MAVOEA_FUZZ_FOREIGN_NAMES_H_

#include <algorithm>
#include <array>
#include <cstdint>
#include <string_view>

namespace mavoea::fuzz {

inline constexpr std::array<const char*, 19> kForeignNames = {
    "user.org.netatalk.Metadata",
    "org.netatalk.Metadata",
    "user.org.netatalk.ResourceFork",
    "user.DOSATTRIB",
    "user.DosStream.AFP_AfpInfo:$DATA",
    "user.DosStream.AFP_Resource:$DATA",
    "user.DosStreamExt.1.AFP_Resource:$DATA",
    "user.DosStream.colour:$DATA",
    "user.DosStreamExt.1.colour:$DATA",
    "user.DosStreamExt.2.colour:$DATA",
    "user.DosStream.com.apple.metadata\xEF\x80\xA2_kMDItemUserTags:$DATA",
    "user.com.apple.metadata:_kMDItemUserTags",
    "user.com.apple.FinderInfo",
    "user.com.apple.ResourceFork",
    "user.colour",
    "user.com.apple.quarantine",
    "user.mavo.attributes",
    "user.SAMBA_PAI",
    "user.DosStream.com.apple.FinderInfo:$DATA",
};

constexpr std::uint8_t ForeignName(std::string_view name) {
    const auto* const found = std::find(kForeignNames.begin(), kForeignNames.end(), name);
    return static_cast<std::uint8_t>(found - kForeignNames.begin());
}

}  // namespace mavoea::fuzz

#endif  // MAVOEA_FUZZ_FOREIGN_NAMES_H_

#include "format/netatalk_record.h"

namespace mavoea {

std::array<std::uint8_t, kAttributeBlockSize> EncodeFreshRecord(
    std::span<const std::uint8_t, kFinderInfoSize> finder_info) {
    std::array<std::uint8_t, kAttributeBlockSize> block{};
    const auto bytes_of = [&](std::uint32_t id) -> ByteView {
        if (static_cast<EntryId>(id) == EntryId::kFinderInfo) return finder_info;
        return {};
    };
    EncodeRecord(kFreshRecord, bytes_of, 0, block);
    return block;
}

}  // namespace mavoea

#include "format/netatalk_record.h"

namespace mavoea {

std::array<std::uint8_t, kAttributeBlockSize> EncodeFreshRecord(
    std::span<const std::uint8_t, kFinderInfoSize> finder_info) {
    std::array<std::uint8_t, kAttributeBlockSize> block{};
    BeWriter out(block);
    EncodeAppleDoubleHeader({.magic = kAppleDoubleMagic,
                             .version = kAppleDoubleVersion2,
                             .filler = {},
                             .entry_count = static_cast<std::uint16_t>(kFreshRecord.size())},
                            out);
    for (const RecordEntry& entry : kFreshRecord) {
        EncodeEntryDescriptor({static_cast<EntryId>(entry.id), entry.data}, out);
        if (entry.slot == Slot::kFinderInfo) {
            std::copy(finder_info.begin(), finder_info.end(), block.begin() + entry.data.offset);
        }
    }
    return block;
}

}  // namespace mavoea

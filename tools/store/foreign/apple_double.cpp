#include "tools/store/foreign/apple_double.h"

#include <algorithm>

#include "format/apple_double.h"

namespace mavoea::tool {
namespace {

// The fork's descriptor stands first, its bytes last.
constexpr std::uint32_t kFinderInfoAt = 50;
constexpr std::uint32_t kForkAt = 82;
static_assert(DescriptorsEnd(2) == kFinderInfoAt && kFinderInfoAt + kFinderInfoSize == kForkAt);

}  // namespace

bool IsMacs(const File& file) {
    const Bytes head = file.Read(0, AppleDoubleHeader::kSize);
    BeReader in(head);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    return in.ok() && std::equal(header.filler.begin(), header.filler.end(), kMacFiller.begin());
}

Bytes EncodeForkHead(std::uint32_t fork_size) {
    AppleDoubleHeader header = {.magic = kAppleDoubleMagic,
                                .version = kAppleDoubleVersion2,
                                .filler = {},
                                .entry_count = 2};
    std::copy(kNetatalkFiller.begin(), kNetatalkFiller.end(), header.filler.begin());
    Bytes head(kForkAt);
    BeWriter out(head);
    EncodeAppleDoubleHeader(header, out);
    EncodeEntryDescriptor({EntryId::kResourceFork, {kForkAt, fork_size}}, out);
    EncodeEntryDescriptor({EntryId::kFinderInfo, {kFinderInfoAt, std::uint32_t{kFinderInfoSize}}},
                          out);
    return head;
}

Pieces EncodeForkFile(const Content& fork) {
    return {Content(EncodeForkHead(static_cast<std::uint32_t>(fork.size()))), fork};
}

}  // namespace mavoea::tool

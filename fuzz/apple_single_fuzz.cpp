// Heads of AppleSingle files from anywhere. The file is as long as the input, which is the head.

#include <cstddef>
#include <cstdint>
#include <vector>

#include "format/apple_single.h"
#include "fuzz/support/platform.h"

using namespace mavoea;
using mavoea::fuzz::Fail;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto file = DecodeAppleSingle({data, size}, size);
    if (!file) return 0;
    std::vector<SingleEntry> entries;
    for (std::uint16_t index = 0; index < file->entry_count(); ++index) {
        entries.push_back(file->entry(index));
        if (entries.back().data.end() > size) Fail("data behind the file's end");
        if (!file->Find(entries.back().id)) Fail("an entry that is not found");
    }
    std::vector<std::uint8_t> head(DescriptorsEnd(file->entry_count()));
    if (!EncodeAppleSingleHead(entries, head)) Fail("no head of what was read");
    const auto again =
        DecodeAppleSingle(head, entries.empty() ? head.size() : entries.back().data.end());
    if (!again || again->entry_count() != file->entry_count()) Fail("another head");
    for (std::uint16_t index = 0; index < again->entry_count(); ++index) {
        if (again->entry(index).id != file->entry(index).id ||
            again->entry(index).data.length != file->entry(index).data.length) {
            Fail("another entry");
        }
    }
    return 0;
}

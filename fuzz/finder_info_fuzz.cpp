// Finder info from anywhere, as a file's and as a folder's: what was read is written as it was.

#include <algorithm>
#include <cstddef>
#include <cstdint>

#include "format/finder_info.h"
#include "fuzz/support/platform.h"

using namespace mavoea;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size < kFinderInfoSize) return 0;
    const FinderInfoView bytes(data, kFinderInfoSize);
    const auto same = [&](const FinderInfoBytes& written) {
        return std::equal(written.begin(), written.end(), bytes.begin(), bytes.end());
    };
    FileFinderInfo file = DecodeFileFinderInfo(bytes);
    if (!same(EncodeFinderInfo(file))) mavoea::fuzz::Fail("a file's changed");
    const FolderFinderInfo folder = DecodeFolderFinderInfo(bytes);
    if (!same(EncodeFinderInfo(folder))) mavoea::fuzz::Fail("a folder's changed");
    if (file.item.flags != folder.item.flags) mavoea::fuzz::Fail("flags lie in two places");
    const std::uint8_t label = file.item.label();
    file.item.SetLabel(static_cast<std::uint8_t>(label ^ 7));
    if (file.item.label() != (label ^ 7)) mavoea::fuzz::Fail("another label was set");
    file.item.SetLabel(label);
    if (!same(EncodeFinderInfo(file))) mavoea::fuzz::Fail("a label changed more");
    return 0;
}

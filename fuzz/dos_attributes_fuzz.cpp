// Samba's DOS attributes from anywhere: read, changed, read again.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "fuzz/support/platform.h"
#include "platform/dos_attributes.h"

using namespace mavoea;
using mavoea::fuzz::Fail;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto before = DecodeDosAttributes({data, size});
    std::vector<std::uint8_t> bytes(data, data + size);
    if (!SetDosAttributes(bytes, 0x89ABCDEF)) {
        if (!std::equal(bytes.begin(), bytes.end(), data)) Fail("changed all the same");
        if (before && before->creation_time) Fail("a creation time that cannot be kept");
        return 0;
    }
    const auto after = DecodeDosAttributes(bytes);
    if (!before || !after) Fail("changed what cannot be read");
    if (after->attributes != 0x89ABCDEF) Fail("other attributes");
    if (after->creation_time != before->creation_time) Fail("another creation time");

    const auto fresh = EncodeDosAttributes(*after);
    const auto again = DecodeDosAttributes(fresh);
    if (!again || again->attributes != after->attributes ||
        again->creation_time != after->creation_time) {
        Fail("a fresh value tells something else");
    }
    return 0;
}

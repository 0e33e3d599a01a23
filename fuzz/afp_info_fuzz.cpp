// "AFP_AfpInfo" streams from anywhere. What can be read is written back, and then the same is read.

#include <algorithm>
#include <cstddef>
#include <cstdint>

#include "format/afp_info.h"
#include "fuzz/support/platform.h"

using namespace mavoea;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto info = DecodeAfpInfo({data, size});
    if (!info) return 0;
    const auto bytes = EncodeAfpInfo(*info);
    if (size != bytes.size()) mavoea::fuzz::Fail("a stream of %zu bytes", size);
    // But for what is reserved.
    if (!std::equal(data, data + 8, bytes.begin()) ||
        !std::equal(data + 12, data + 54, bytes.begin() + 12)) {
        mavoea::fuzz::Fail("another stream was written");
    }
    return 0;
}

// Heads of MacBinary files from anywhere, with a right checksum, too. What is read is written, as
// version 3.

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>

#include "format/crc16.h"
#include "format/mac_binary.h"
#include "fuzz/support/platform.h"

using namespace mavoea;
using mavoea::fuzz::Fail;

namespace {

void Use(ByteView head, std::uint64_t file_size) {
    const auto file = DecodeMacBinary(head, file_size);
    if (!file) return;
    const MacBinaryHead& info = file->head;
    if ((info.data_length != 0 && file->data_offset + info.data_length > file_size) ||
        (info.resource_length != 0 && file->resource_offset + info.resource_length > file_size) ||
        (info.comment_length != 0 && file->comment_offset + info.comment_length > file_size)) {
        Fail("a part behind the file's end");
    }
    const auto bytes = EncodeMacBinaryHead(info);
    if (!bytes) Fail("no head of what was read");
    const auto again = DecodeMacBinary(*bytes, UINT64_MAX);
    if (!again || again->version != 3 || again->head.name != info.name ||
        again->head.finder_info != info.finder_info || again->head.locked != info.locked ||
        again->head.creation_time != info.creation_time ||
        again->head.modification_time != info.modification_time ||
        again->head.data_length != info.data_length ||
        again->head.resource_length != info.resource_length ||
        again->head.comment_length != info.comment_length) {
        Fail("another head");
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    Use({data, size}, size);
    if (size < kMacBinaryHeadSize) return 0;
    std::array<std::uint8_t, kMacBinaryHeadSize> head{};
    std::copy_n(data, head.size(), head.begin());
    StoreBe16(Crc16(ByteView(head).first(124)), &head[124]);
    Use(head, size);
    Use(head, UINT64_MAX);
    return 0;
}

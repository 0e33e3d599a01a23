#include "format/mac_binary.h"

#include <algorithm>

#include "format/crc16.h"
#include "format/finder_info.h"

namespace mavoea {
namespace {

constexpr std::size_t kChecked = 124;  // bytes under the checksum
constexpr std::size_t kSecondVersion = 101;
constexpr std::uint32_t kSignature = 0x6D42494E;  // "mBIN"
constexpr std::uint8_t kVersion3 = 130;
constexpr std::uint8_t kVersionNeeded = 129;

// Where the Finder info is: type, creator and the high byte of the flags, and behind a zero place
// and window; the flags' low byte; the extended flags.
constexpr std::size_t kTypeAt = 65;
constexpr std::size_t kHighFlagsAt = 73;
constexpr std::size_t kPlaceAt = 75;
constexpr std::size_t kLowFlagsAt = 101;
constexpr std::size_t kExtendedFlagsAt = 106;

// Versions before the third have no extended flags, and the first has zeros for the low flags.
FinderInfoBytes DecodeFinderInfo(ByteView head, int version) {
    FileFinderInfo info;
    BeReader in(head.subspan(kTypeAt));
    in.Copy(info.type);
    in.Copy(info.creator);
    info.item.flags = static_cast<std::uint16_t>(head[kHighFlagsAt] << 8 | head[kLowFlagsAt]);
    BeReader place(head.subspan(kPlaceAt));
    info.item.place.down = static_cast<std::int16_t>(place.U16());
    info.item.place.across = static_cast<std::int16_t>(place.U16());
    info.item.window = place.U16();
    if (version > 2) info.item.extended_flags = LoadBe16(&head[kExtendedFlagsAt]);
    return EncodeFinderInfo(info);
}

void EncodeInto(ByteSpan head, FinderInfoView finder_info) {
    const FileFinderInfo info = DecodeFileFinderInfo(finder_info);
    BeWriter out(head.subspan(kTypeAt));
    out.Copy(info.type);
    out.Copy(info.creator);
    head[kHighFlagsAt] = static_cast<std::uint8_t>(info.item.flags >> 8);
    head[kLowFlagsAt] = static_cast<std::uint8_t>(info.item.flags);
    BeWriter place(head.subspan(kPlaceAt));
    place.U16(static_cast<std::uint16_t>(info.item.place.down));
    place.U16(static_cast<std::uint16_t>(info.item.place.across));
    place.U16(info.item.window);
    StoreBe16(info.item.extended_flags, &head[kExtendedFlagsAt]);
}

bool AllZeros(ByteView bytes) {
    return std::all_of(bytes.begin(), bytes.end(), [](std::uint8_t byte) { return byte == 0; });
}

// 0 where the bytes are no header.
int VersionOf(ByteView head) {
    if (head[0] != 0 || head[74] != 0) return 0;
    if (Crc16(head.first(kChecked)) != LoadBe16(&head[kChecked])) {
        return head[82] == 0 &&
                       AllZeros(head.subspan(kSecondVersion, kChecked + 2 - kSecondVersion))
                   ? 1
                   : 0;
    }
    return LoadBe32(&head[102]) == kSignature ? 3 : 2;
}

}  // namespace

std::optional<MacBinary> DecodeMacBinary(ByteView head, std::uint64_t file_size) {
    if (head.size() < kMacBinaryHeadSize) return std::nullopt;
    MacBinary file;
    // A checksum of zeros is also right for zeros, which the name's size rules out.
    file.version = VersionOf(head);
    const std::uint8_t name_size = head[1];
    if (file.version == 0 || name_size < 1 || name_size > kMacBinaryNameMax) return std::nullopt;
    MacBinaryHead& info = file.head;
    info.name = {reinterpret_cast<const char*>(&head[2]), name_size};

    info.finder_info = DecodeFinderInfo(head, file.version);
    info.locked = (head[81] & 1) != 0;
    info.data_length = LoadBe32(&head[83]);
    info.resource_length = LoadBe32(&head[87]);
    info.creation_time = LoadBe32(&head[91]);
    info.modification_time = LoadBe32(&head[95]);
    info.comment_length = LoadBe16(&head[99]);
    // Version 1 has zeros from here on.
    if (head[123] > kVersionNeeded) return std::nullopt;
    const std::uint16_t second_header = LoadBe16(&head[120]);
    if (info.data_length > kMacBinaryForkMax || info.resource_length > kMacBinaryForkMax) {
        return std::nullopt;
    }

    file.data_offset = kMacBinaryHeadSize + MacBinaryPadded(second_header);
    file.resource_offset = file.data_offset + MacBinaryPadded(info.data_length);
    file.comment_offset = file.resource_offset + MacBinaryPadded(info.resource_length);
    std::uint64_t end = file.data_offset;
    if (info.data_length != 0) end = file.data_offset + info.data_length;
    if (info.resource_length != 0) end = file.resource_offset + info.resource_length;
    if (info.comment_length != 0) end = file.comment_offset + info.comment_length;
    if (end > file_size) return std::nullopt;
    return file;
}

std::optional<std::array<std::uint8_t, kMacBinaryHeadSize>> EncodeMacBinaryHead(
    const MacBinaryHead& head) {
    if (head.name.empty() || head.name.size() > kMacBinaryNameMax ||
        head.data_length > kMacBinaryForkMax || head.resource_length > kMacBinaryForkMax) {
        return std::nullopt;
    }
    std::array<std::uint8_t, kMacBinaryHeadSize> bytes{};
    bytes[1] = static_cast<std::uint8_t>(head.name.size());
    std::copy(head.name.begin(), head.name.end(), &bytes[2]);
    EncodeInto(bytes, head.finder_info);
    bytes[81] = head.locked ? 1 : 0;
    StoreBe32(head.data_length, &bytes[83]);
    StoreBe32(head.resource_length, &bytes[87]);
    StoreBe32(head.creation_time, &bytes[91]);
    StoreBe32(head.modification_time, &bytes[95]);
    StoreBe16(head.comment_length, &bytes[99]);
    StoreBe32(kSignature, &bytes[102]);
    bytes[122] = kVersion3;
    bytes[123] = kVersionNeeded;
    StoreBe16(Crc16(ByteView(bytes).first(kChecked)), &bytes[kChecked]);
    return bytes;
}

}  // namespace mavoea

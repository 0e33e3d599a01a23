#include "format/bin_hex.h"

#include <algorithm>

namespace mavoea {
namespace {

// The line as far as all versions of it are alike.
constexpr std::string_view kLineBegins = "(This file must be converted with BinHex";

bool IsSpace(std::uint8_t c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }

}  // namespace

BinHexReader::BinHexReader(ByteView text) {
    const auto line = std::search(text.begin(), text.end(), kLineBegins.begin(), kLineBegins.end());
    const auto colon = std::find(line, text.end(), ':');
    if (colon != text.end()) left_ = {colon + 1, text.end()};
}

std::optional<std::uint8_t> BinHexReader::Packed() {
    while (bit_count_ < 8) {
        if (left_.empty()) return std::nullopt;
        const std::uint8_t c = left_.front();
        if (!IsSpace(c)) {
            const std::size_t digit = kBinHexDigits.find(static_cast<char>(c));
            if (digit == std::string_view::npos) return std::nullopt;  // as the ':' at the end
            bits_ = bits_ << 6 | static_cast<std::uint32_t>(digit);
            bit_count_ += 6;
        }
        left_ = left_.subspan(1);
    }
    bit_count_ -= 8;
    return static_cast<std::uint8_t>(bits_ >> bit_count_);
}

std::optional<std::uint8_t> BinHexReader::Unpacked() {
    while (repeats_ == 0) {
        const auto byte = Packed();
        if (byte != kBinHexRun) return last_ = byte;
        const auto count = Packed();
        if (!count) return std::nullopt;
        if (*count == 0) return last_ = kBinHexRun;
        if (!last_) return std::nullopt;
        repeats_ = *count - 1U;  // one of them has been read
    }
    --repeats_;
    return last_;
}

bool BinHexReader::Read(ByteSpan to) {
    for (std::uint8_t& byte : to) {
        const auto next = Unpacked();
        if (!next) return false;
        byte = *next;
    }
    crc_ = Crc16(to, crc_);
    return true;
}

bool BinHexReader::EndPart() {
    // Bytes with their checksum behind them have the checksum 0, with which the next part begins.
    std::array<std::uint8_t, 2> bytes{};
    return Read(bytes) && crc_ == 0;
}

std::optional<BinHexHead> BinHexReader::ReadHead() {
    BinHexHead head;
    if (!Read({&head.name_size, 1}) || head.name_size < 1 || head.name_size > kBinHexNameMax) {
        return std::nullopt;
    }
    std::array<std::uint8_t, kBinHexHeadMax - 1> bytes{};
    const ByteSpan rest = ByteSpan(bytes).first(bytes.size() - kBinHexNameMax + head.name_size);
    if (!Read(rest)) return std::nullopt;
    std::copy_n(rest.begin(), head.name_size, head.name_bytes.begin());
    BeReader in(rest.subspan(head.name_size));
    in.U8();
    in.Copy(head.finder_info);
    head.data_length = in.U32();
    head.resource_length = in.U32();
    if (!EndPart()) return std::nullopt;
    return head;
}

}  // namespace mavoea

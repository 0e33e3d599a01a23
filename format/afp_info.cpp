#include "format/afp_info.h"

namespace mavoea {
namespace {

constexpr std::uint32_t kSignature = 0x41465000;  // "AFP" and a NUL
constexpr std::uint32_t kVersion = 0x00000100;

}  // namespace

std::optional<AfpInfo> DecodeAfpInfo(ByteView bytes) {
    if (bytes.size() != kAfpInfoSize) return std::nullopt;
    BeReader in(bytes);
    if (in.U32() != kSignature || in.U32() != kVersion) return std::nullopt;
    in.U32();  // reserved
    AfpInfo info;
    info.backup_time = in.U32();
    in.Copy(info.finder_info);
    in.Copy(info.prodos_info);
    return info;
}

std::array<std::uint8_t, kAfpInfoSize> EncodeAfpInfo(const AfpInfo& info) {
    std::array<std::uint8_t, kAfpInfoSize> bytes{};
    BeWriter out(bytes);
    out.U32(kSignature);
    out.U32(kVersion);
    out.U32(0);
    out.U32(info.backup_time);
    out.Copy(info.finder_info);
    out.Copy(info.prodos_info);
    return bytes;
}

}  // namespace mavoea

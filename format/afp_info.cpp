#include "format/afp_info.h"

namespace mavoea {
namespace {

constexpr std::uint32_t kSignature = 0x41465000;  // "AFP" and a NUL
constexpr std::uint32_t kVersion = 0x00000100;

}  // namespace

bool AfpInfoFields::HasSignature() const { return signature == kSignature; }

bool AfpInfoFields::HasVersion() const { return version == kVersion; }

std::optional<AfpInfoFields> ReadAfpInfoFields(ByteView bytes) {
    if (bytes.size() < kAfpInfoSize) return std::nullopt;
    BeReader in(bytes);
    AfpInfoFields fields;
    fields.signature = in.U32();
    fields.version = in.U32();
    fields.reserved = in.U32();
    fields.info.backup_time = in.U32();
    in.Copy(fields.info.finder_info);
    in.Copy(fields.info.prodos_info);
    in.Copy(fields.reserved_at_end);
    return fields;
}

std::optional<AfpInfo> DecodeAfpInfo(ByteView bytes) {
    if (bytes.size() != kAfpInfoSize) return std::nullopt;
    const auto fields = ReadAfpInfoFields(bytes);
    if (!fields || !fields->HasSignature() || !fields->HasVersion()) return std::nullopt;
    return fields->info;
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

#include "format/finder_info.h"

namespace mavoea {
namespace {

FinderPoint DecodePoint(BeReader& in) {
    const auto down = static_cast<std::int16_t>(in.U16());
    return {down, static_cast<std::int16_t>(in.U16())};
}

void EncodePoint(FinderPoint point, BeWriter& out) {
    out.U16(static_cast<std::uint16_t>(point.down));
    out.U16(static_cast<std::uint16_t>(point.across));
}

// The bytes from 8 to 15, and from 20 on. Between them files and folders differ.
void DecodeFirst(BeReader& in, FinderItem* item) {
    item->flags = in.U16();
    item->place = DecodePoint(in);
    item->window = in.U16();
}
void DecodeLast(BeReader& in, FinderItem* item) {
    in.Copy(item->reserved);
    item->extended_flags = in.U16();
    item->comment = in.U16();
    item->put_away = static_cast<std::int32_t>(in.U32());
}

void EncodeFirst(const FinderItem& item, BeWriter& out) {
    out.U16(item.flags);
    EncodePoint(item.place, out);
    out.U16(item.window);
}
void EncodeLast(const FinderItem& item, BeWriter& out) {
    out.Copy(item.reserved);
    out.U16(item.extended_flags);
    out.U16(item.comment);
    out.U32(static_cast<std::uint32_t>(item.put_away));
}

}  // namespace

FileFinderInfo DecodeFileFinderInfo(FinderInfoView bytes) {
    BeReader in(bytes);
    FileFinderInfo info;
    in.Copy(info.type);
    in.Copy(info.creator);
    DecodeFirst(in, &info.item);
    in.Copy(info.reserved);
    DecodeLast(in, &info.item);
    return info;
}

FolderFinderInfo DecodeFolderFinderInfo(FinderInfoView bytes) {
    BeReader in(bytes);
    FolderFinderInfo info;
    info.window_begin = DecodePoint(in);
    info.window_end = DecodePoint(in);
    DecodeFirst(in, &info.item);
    info.scrolled = DecodePoint(in);
    DecodeLast(in, &info.item);
    return info;
}

FinderInfoBytes EncodeFinderInfo(const FileFinderInfo& info) {
    FinderInfoBytes bytes{};
    BeWriter out(bytes);
    out.Copy(info.type);
    out.Copy(info.creator);
    EncodeFirst(info.item, out);
    out.Copy(info.reserved);
    EncodeLast(info.item, out);
    return bytes;
}

FinderInfoBytes EncodeFinderInfo(const FolderFinderInfo& info) {
    FinderInfoBytes bytes{};
    BeWriter out(bytes);
    EncodePoint(info.window_begin, out);
    EncodePoint(info.window_end, out);
    EncodeFirst(info.item, out);
    EncodePoint(info.scrolled, out);
    EncodeLast(info.item, out);
    return bytes;
}

}  // namespace mavoea

#include "tools/exchange/archiving.h"

#include <algorithm>
#include <array>

#include "format/apple_single.h"
#include "format/bin_hex.h"
#include "format/mac_binary.h"
#include "tools/say/mac_text.h"
#include "tools/store/encoding.h"
#include "tools/store/fitting.h"

namespace mavoea::tool {
namespace {

using Put = std::function<void(ByteView)>;

constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;

std::string NoPlace(ArchiveFormat format) {
    return std::string(NameOf(format)) + " has no place for it";
}

Bytes FinderInfo(const Metadata& metadata) {
    return metadata.finder_info ? metadata.finder_info->value.All() : Bytes(kFinderInfoSize);
}

std::uint64_t ForkSize(const Metadata& metadata) {
    return metadata.fork ? metadata.fork->value.size() : 0;
}

// ---- What fits ----------------------------------------------------------------------------------

class Fitting {
 public:
    Fitting(Archive* archive, std::vector<Missing>* missing)
        : archive_(*archive), metadata_(archive->metadata), missing_(*missing) {}

    void Fit() {
        DropOthers();
        if (archive_.format == ArchiveFormat::kAppleDouble) {
            return FitAppleDouble(&metadata_, &missing_);
        }
        metadata_.whole_apple_double.reset();
        DropDamaged(&metadata_);
        for (const Metadata::Attribute& attribute : metadata_.attributes) {
            Miss(NameOfAttribute(attribute.name));
        }
        metadata_.attributes.clear();
        switch (archive_.format) {
            case ArchiveFormat::kAppleDouble:
                break;
            case ArchiveFormat::kAppleSingle:
                // The entry of that id has the object's own name.
                DropEntry(kRealName);
                return;
            case ArchiveFormat::kMacBinary:
                RequireForks(kMacBinaryForkMax, "2 GiB");
                FitName(kMacBinaryNameMax);
                FitDates();
                FitComment();
                FitFinderInfo(InMacBinary(FinderInfo(metadata_)));
                break;
            case ArchiveFormat::kBinHex:
                RequireForks(kBinHexForkMax, "1 GiB");
                FitName(kBinHexNameMax);
                FitFinderInfo(InBinHex(FinderInfo(metadata_)));
                break;
        }
        const auto keeps = [&](EntryId id) {
            return archive_.format == ArchiveFormat::kMacBinary &&
                   (id == EntryId::kComment || id == EntryId::kFileDates);
        };
        std::erase_if(metadata_.entries, [&](const auto& entry) {
            if (keeps(entry.first)) return false;
            if (SaysSomething(entry.first, entry.second.value.All())) {
                Miss(NameOfEntry(entry.first));
            }
            return true;
        });
    }

 private:
    void Miss(const std::string& item) { missing_.push_back({item, NoPlace(archive_.format)}); }

    // What none of the formats has a place for.
    void DropOthers() {
        metadata_.whole_stream.reset();
        metadata_.whole_resource.reset();
        metadata_.whole_record.reset();
        for (const Metadata::Stray& stray : metadata_.strays) {
            missing_.push_back({stray.item, stray.reason});
        }
        metadata_.strays.clear();
        for (const Metadata::ServiceFile& service : metadata_.services) {
            Miss(NameOfAttribute(service.name) + " of another service");
        }
        metadata_.services.clear();
        const bool locks = archive_.format == ArchiveFormat::kAppleSingle ||
                           archive_.format == ArchiveFormat::kMacBinary;
        if (metadata_.locked && !locks) {
            Miss("locked state");
            metadata_.locked = false;
        }
        if (metadata_.hidden) Miss("hidden mark");
        if (metadata_.system) Miss("system mark");
        if (metadata_.created) Miss("creation time");
        metadata_.hidden = metadata_.system = false;
        metadata_.created.reset();
    }

    void DropEntry(EntryId id) {
        if (metadata_.entries.erase(id) > 0) Miss(NameOfEntry(id));
    }

    void RequireForks(std::uint64_t most, const char* in_words) const {
        if (archive_.data->size() <= most && ForkSize(metadata_) <= most) return;
        throw Failure(kFailed, archive_.name,
                      std::string("a fork of it has more than the ") + in_words + " that " +
                          NameOf(archive_.format) + " has room for",
                      "use --format appledouble, and copy the data");
    }

    void FitName(std::size_t most) {
        if (const auto roman = ToMacRoman(archive_.name); roman && roman->size() <= most) return;
        missing_.push_back({"name", std::string(NameOf(archive_.format)) + " has room for " +
                                        std::to_string(most) + " letters of Mac OS Roman"});
        std::string name;
        for (const char c : archive_.name) {
            if (name.size() == most) break;
            const auto byte = static_cast<std::uint8_t>(c);
            const bool follows = (byte & 0xC0) == 0x80;
            if (!follows) name += byte < 0x80 ? c : '_';
        }
        archive_.name = name.empty() ? "_" : name;
    }

    static Bytes InMacBinary(const Bytes& info) {
        MacBinaryHead head;
        std::copy(info.begin(), info.end(), head.finder_info.begin());
        head.name = "_";
        const auto bytes = EncodeMacBinaryHead(head);
        const auto kept = DecodeMacBinary(*bytes, bytes->size())->head.finder_info;
        return {kept.begin(), kept.end()};
    }

    static Bytes InBinHex(Bytes info) {
        std::fill(info.begin() + std::tuple_size_v<decltype(BinHexHead::finder_info)>, info.end(),
                  std::uint8_t{0});
        return info;
    }

    void FitFinderInfo(const Bytes& kept) {
        if (!metadata_.finder_info || kept == metadata_.finder_info->value.All()) return;
        missing_.push_back(
            {"Finder info", std::string(NameOf(archive_.format)) + " has no place for all of it"});
        if (IsAllZero(kept)) {
            metadata_.finder_info.reset();
        } else {
            metadata_.finder_info->value = Content(kept);
        }
    }

    void FitComment() {
        const auto found = metadata_.entries.find(EntryId::kComment);
        if (found == metadata_.entries.end() || found->second.value.size() <= UINT16_MAX) return;
        DropEntry(EntryId::kComment);
    }

    // Of the four those of creation and modification, and both only.
    void FitDates() {
        const auto found = metadata_.entries.find(EntryId::kFileDates);
        if (found == metadata_.entries.end()) return;
        Bytes dates = found->second.value.All();
        const auto has = [&](std::size_t at) {
            const std::uint32_t date = LoadBe32(&dates[at]);
            return date != kUnknownDate &&
                   ToMacTime(kAfpEpoch + static_cast<std::int32_t>(date)).has_value();
        };
        if (dates.size() != kFileDatesSize || !has(0) || !has(4)) {
            return DropEntry(EntryId::kFileDates);
        }
        bool others = false;
        for (std::size_t at = kBackupDateOffset; at < kFileDatesSize; at += 4) {
            others = others || LoadBe32(&dates[at]) != kUnknownDate;
            StoreBe32(kUnknownDate, &dates[at]);
        }
        if (!others) return;
        missing_.push_back({"dates of backup and access", NoPlace(archive_.format)});
        found->second.value = Content(std::move(dates));
    }

    Archive& archive_;
    Metadata& metadata_;
    std::vector<Missing>& missing_;
};

// ---- What is put out ----------------------------------------------------------------------------

void PutAll(const Content& content, const Put& put) {
    for (std::uint64_t at = 0; at < content.size();) {
        const Bytes piece = content.Read(at, kPiece);
        put(piece);
        at += piece.size();
    }
}

void PutPadding(std::uint64_t size, const Put& put) {
    const std::array<std::uint8_t, kMacBinaryHeadSize> zeros{};
    put(ByteView(zeros).first(static_cast<std::size_t>(MacBinaryPadded(size) - size)));
}

void PutAppleDouble(const Metadata& metadata, const Put& put) {
    Pieces pieces = EncodeAppleDouble(metadata);
    if (pieces.empty()) pieces = EncodePlain(metadata);
    for (const Content& piece : pieces) PutAll(piece, put);
}

void PutAppleSingle(const Archive& archive, const Put& put) {
    const Metadata& metadata = archive.metadata;
    std::vector<SingleEntry> entries;
    Pieces pieces;
    bool fits = true;
    const auto add = [&](std::uint32_t id, const Content& content) {
        fits = fits && content.size() <= UINT32_MAX;
        entries.push_back({id, {0, static_cast<std::uint32_t>(content.size())}});
        pieces.push_back(content);
    };
    add(kSingleRealName, Content(Bytes(archive.name.begin(), archive.name.end())));
    if (metadata.finder_info) {
        add(static_cast<std::uint32_t>(EntryId::kFinderInfo), metadata.finder_info->value);
    }
    auto all = metadata.entries;
    if (metadata.locked) {
        const auto found = all.find(kMacInfo);
        Bytes info = found == all.end() ? Bytes() : found->second.value.All();
        if (info.size() < kMacInfoSize) info.resize(kMacInfoSize);
        info[kMacInfoSize - 1] |= 1;
        all[kMacInfo].value = Content(std::move(info));
    }
    for (const auto& [id, item] : all) add(static_cast<std::uint32_t>(id), item.value);
    add(kSingleDataFork, *archive.data);
    if (metadata.fork) {
        add(static_cast<std::uint32_t>(EntryId::kResourceFork), metadata.fork->value);
    }
    Bytes head(DescriptorsEnd(static_cast<std::uint16_t>(entries.size())));
    if (!fits || !EncodeAppleSingleHead(entries, head)) {
        throw Failure(kFailed, archive.name, "as an AppleSingle file it would pass 4 GiB",
                      "use --format appledouble, and copy the data");
    }
    put(head);
    for (const Content& piece : pieces) PutAll(piece, put);
}

void PutMacBinary(const Archive& archive, const Put& put) {
    const Metadata& metadata = archive.metadata;
    const std::string name = *ToMacRoman(archive.name);
    MacBinaryHead head = {.name = name};
    const Bytes info = FinderInfo(metadata);
    std::copy(info.begin(), info.end(), head.finder_info.begin());
    head.locked = metadata.locked;
    const auto dates = metadata.entries.find(EntryId::kFileDates);
    if (dates != metadata.entries.end()) {
        const Bytes bytes = dates->second.value.All();
        const auto date = [&](std::size_t at) {
            return *ToMacTime(kAfpEpoch + static_cast<std::int32_t>(LoadBe32(&bytes[at])));
        };
        head.creation_time = date(0);
        head.modification_time = date(4);
    } else if (archive.modified) {
        head.modification_time = ToMacTime(*archive.modified).value_or(0);
    }
    head.data_length = static_cast<std::uint32_t>(archive.data->size());
    head.resource_length = static_cast<std::uint32_t>(ForkSize(metadata));
    const auto comment = metadata.entries.find(EntryId::kComment);
    const bool has_comment = comment != metadata.entries.end();
    if (has_comment) head.comment_length = static_cast<std::uint16_t>(comment->second.value.size());
    put(*EncodeMacBinaryHead(head));
    const auto put_part = [&](const Content& part) {
        PutAll(part, put);
        PutPadding(part.size(), put);
    };
    put_part(*archive.data);
    if (metadata.fork) put_part(metadata.fork->value);
    if (has_comment) put_part(comment->second.value);
}

void PutBinHex(const Archive& archive, const Put& put) {
    const Metadata& metadata = archive.metadata;
    Bytes text;
    const auto flush = [&] {
        put(text);
        text.clear();
    };
    BinHexWriter writer([&](char c) { text.push_back(static_cast<std::uint8_t>(c)); });
    const std::string name = *ToMacRoman(archive.name);
    BinHexHead head;
    head.name_size = static_cast<std::uint8_t>(name.size());
    std::copy(name.begin(), name.end(), head.name_bytes.begin());
    const Bytes info = FinderInfo(metadata);
    std::copy_n(info.begin(), head.finder_info.size(), head.finder_info.begin());
    head.data_length = static_cast<std::uint32_t>(archive.data->size());
    head.resource_length = static_cast<std::uint32_t>(ForkSize(metadata));
    (void)writer.WriteHead(head);
    const auto write = [&](ByteView bytes) {
        writer.Write(bytes);
        flush();
    };
    PutAll(*archive.data, write);
    writer.EndPart();
    if (metadata.fork) PutAll(metadata.fork->value, write);
    writer.EndPart();
    writer.EndText();
    flush();
}

}  // namespace

void FitArchive(Archive* archive, std::vector<Missing>* missing) {
    Fitting(archive, missing).Fit();
}

void WriteArchive(const Archive& archive, const Put& put) {
    switch (archive.format) {
        case ArchiveFormat::kAppleDouble:
            return PutAppleDouble(archive.metadata, put);
        case ArchiveFormat::kAppleSingle:
            return PutAppleSingle(archive, put);
        case ArchiveFormat::kMacBinary:
            return PutMacBinary(archive, put);
        case ArchiveFormat::kBinHex:
            return PutBinHex(archive, put);
    }
}

}  // namespace mavoea::tool

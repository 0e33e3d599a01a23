#include "tools/exchange/archive.h"

#include <algorithm>

#include "format/apple_single.h"
#include "format/bin_hex.h"
#include "format/mac_binary.h"
#include "tools/say/mac_text.h"
#include "tools/store/gathering.h"
#include "tools/store/reader.h"

namespace mavoea::tool {
namespace {

// The line of a BinHex file may stand behind a letter.
constexpr std::uint64_t kHeadMax = kSmallFile;
constexpr std::uint64_t kTextMax = std::uint64_t{3} << 30;
constexpr std::uint16_t kEntryMax = 64;  // there are no more than 16 kinds
constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;

Failure Damaged(const File& file, const std::string& what) {
    return {kFailed, file.path(), "damaged: " + what, "get it once more from where it came from"};
}

// ---- AppleSingle --------------------------------------------------------------------------------

void TakeLock(Metadata* metadata) {
    const auto found = metadata->entries.find(kMacInfo);
    if (found == metadata->entries.end() || found->second.value.size() < kMacInfoSize) return;
    Bytes info = found->second.value.All();
    metadata->locked = (info[kMacInfoSize - 1] & 1) != 0;
    info[kMacInfoSize - 1] &= 0xFE;
    if (IsAllZero(info)) {
        metadata->entries.erase(found);
    } else {
        found->second.value = Content(std::move(info));
    }
}

Archive ReadAppleSingle(const std::shared_ptr<const File>& file, const AppleSingle& single) {
    Archive archive = {.format = ArchiveFormat::kAppleSingle};
    const Origin origin = {file->path()};
    Gathering gathering(&archive.metadata);
    std::uint64_t total = 0;
    if (single.entry_count() > kEntryMax) {
        throw Damaged(*file, "it declares " + std::to_string(single.entry_count()) + " entries");
    }
    for (std::uint16_t i = 0; i < single.entry_count(); ++i) {
        const auto [id, range] = single.entry(i);
        // Entries that share bytes could make much of little.
        total += range.length;
        if (total > file->Size()) throw Damaged(*file, "its entries share bytes");
        // Of two of one id the first counts.
        if (single.Find(id) != range) continue;
        Content value(file, range.offset, range.length);
        if (id == kSingleDataFork) {
            archive.data = std::move(value);
        } else if (range.length == 0) {
            continue;
        } else if (id == kSingleRealName) {
            const Bytes bytes = value.Read(0, kHeadMax);
            const std::string name(bytes.begin(), bytes.end());
            archive.name = IsUtf8(name) ? name : FromMacRoman(name);
        } else if (static_cast<EntryId>(id) == EntryId::kResourceFork) {
            gathering.AddFork(std::move(value), origin);
        } else if (static_cast<EntryId>(id) != EntryId::kFinderInfo) {
            gathering.AddEntry(static_cast<EntryId>(id), std::move(value), origin);
        } else if (range.length < kFinderInfoSize) {
            gathering.AddStray("Finder info", "it has fewer bytes than it should", origin);
        } else {
            gathering.AddFinderInfo(Content(file, range.offset, kFinderInfoSize), origin);
            if (!IsAllZero(value.Read(kFinderInfoSize, kHeadMax))) {
                gathering.AddStray("what is behind the Finder info", "it is of no known kind",
                                   origin);
            }
        }
    }
    TakeLock(&archive.metadata);
    return archive;
}

// ---- MacBinary ----------------------------------------------------------------------------------

std::uint32_t AfpTime(std::optional<std::int64_t> time) {
    if (!time) return kUnknownDate;
    const std::int64_t since = *time - kAfpEpoch;
    if (since <= INT32_MIN || since > INT32_MAX) return kUnknownDate;
    return static_cast<std::uint32_t>(since);
}

void AddDates(const MacBinaryHead& head, const Origin& origin, Archive* archive) {
    if (head.modification_time != 0) archive->modified = FromMacTime(head.modification_time);
    if (head.creation_time == 0) return;
    Bytes dates(kFileDatesSize);
    BeWriter out(dates);
    out.U32(AfpTime(FromMacTime(head.creation_time)));
    out.U32(AfpTime(archive->modified));
    out.U32(kUnknownDate);
    out.U32(kUnknownDate);
    Gathering(&archive->metadata).AddEntry(EntryId::kFileDates, Content(std::move(dates)), origin);
}

Archive ReadMacBinary(const std::shared_ptr<const File>& file, const MacBinary& binary) {
    Archive archive = {.format = ArchiveFormat::kMacBinary};
    const Origin origin = {file->path()};
    const MacBinaryHead& head = binary.head;
    archive.name = FromMacRoman(head.name);
    archive.data = Content(file, binary.data_offset, head.data_length);
    archive.metadata.locked = head.locked;
    Gathering gathering(&archive.metadata);
    gathering.AddFinderInfo(Content({head.finder_info.begin(), head.finder_info.end()}), origin);
    gathering.AddFork(Content(file, binary.resource_offset, head.resource_length), origin);
    if (head.comment_length > 0) {
        gathering.AddEntry(EntryId::kComment,
                           Content(file, binary.comment_offset, head.comment_length), origin);
    }
    AddDates(head, origin, &archive);
    return archive;
}

// ---- BinHex -------------------------------------------------------------------------------------

bool IsBinHex(const Bytes& head) {
    constexpr std::string_view kBegins = "(This file must be converted with BinHex";
    return std::search(head.begin(), head.end(), kBegins.begin(), kBegins.end()) != head.end();
}

// Writes a fork to `to` from there on; false where the text is damaged.
bool Unpack(std::uint32_t size, std::uint64_t offset, const File& to, BinHexReader* reader) {
    Bytes piece;
    for (std::uint64_t done = 0; done < size; done += piece.size()) {
        piece.resize(static_cast<std::size_t>(std::min(kPiece, size - done)));
        if (!reader->Read(piece)) return false;
        to.Write(offset + done, piece);
    }
    return reader->EndPart();
}

Archive ReadBinHex(const std::shared_ptr<const File>& file, const DirectoryRef& scratch) {
    if (file->Size() > kTextMax) {
        throw Failure(kFailed, file->path(),
                      "it has more than the 3 GiB that are read of such files",
                      "use MacBinary or AppleSingle for it");
    }
    const Bytes text = file->Read(0, kTextMax);
    BinHexReader reader(text);
    const auto head = reader.ReadHead();
    if (!head) throw Damaged(*file, "its head is not what its checksum says");
    if (head->data_length > kBinHexForkMax || head->resource_length > kBinHexForkMax) {
        throw Failure(kFailed, file->path(), "a fork in it has more than 1 GiB",
                      "use MacBinary or AppleSingle for it");
    }
    const TemporaryFile unpacked({scratch, "unpacked", file->path()});
    if (!Unpack(head->data_length, 0, unpacked.file(), &reader)) {
        throw Damaged(*file, "its data fork is not what its checksum says");
    }
    if (!Unpack(head->resource_length, head->data_length, unpacked.file(), &reader)) {
        throw Damaged(*file, "its resource fork is not what its checksum says");
    }
    Archive archive = {.format = ArchiveFormat::kBinHex};
    archive.name = FromMacRoman(head->name());
    archive.data = Content(unpacked.shared_file(), 0, head->data_length);
    const Origin origin = {file->path()};
    Gathering gathering(&archive.metadata);
    Bytes finder_info(head->finder_info.begin(), head->finder_info.end());
    finder_info.resize(kFinderInfoSize);
    gathering.AddFinderInfo(Content(std::move(finder_info)), origin);
    gathering.AddFork(Content(unpacked.shared_file(), head->data_length, head->resource_length),
                      origin);
    return archive;
}

}  // namespace

const char* NameOf(ArchiveFormat format) {
    switch (format) {
        case ArchiveFormat::kAppleDouble:
            return "AppleDouble";
        case ArchiveFormat::kAppleSingle:
            return "AppleSingle";
        case ArchiveFormat::kMacBinary:
            return "MacBinary";
        case ArchiveFormat::kBinHex:
            break;
    }
    return "BinHex";
}

Archive ReadArchive(const std::shared_ptr<const File>& file, const DirectoryRef& scratch) {
    const Bytes head = file->Read(0, kHeadMax);
    const std::uint32_t magic = head.size() < 4 ? 0 : LoadBe32(head.data());
    if (magic == kAppleDoubleMagic) {
        return {.format = ArchiveFormat::kAppleDouble, .metadata = ReadAppleDoubleFile(file)};
    }
    if (magic == kAppleSingleMagic) {
        const Bytes all = file->Read(0, DescriptorsEnd(UINT16_MAX));
        const auto single = DecodeAppleSingle(all, file->Size());
        if (!single) throw Damaged(*file, "its entries pass the end of the file");
        return ReadAppleSingle(file, *single);
    }
    if (const auto binary = DecodeMacBinary(head, file->Size())) {
        return ReadMacBinary(file, *binary);
    }
    if (IsBinHex(head)) return ReadBinHex(file, scratch);
    throw Failure(kFailed, file->path(), "no AppleDouble, AppleSingle, MacBinary or BinHex file",
                  "see what it is with: file FILE");
}

}  // namespace mavoea::tool

#include "tools/store/apple_double_file.h"

#include <algorithm>
#include <array>

#include "tools/say/messages.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {
namespace {

constexpr const char* kLook = "look at it with: mavoea dump FILE";

}  // namespace

void RequireAppleDouble(const Layout& layout, const std::string& path) {
    if (layout.file_size == 0 || layout.IsAppleDouble()) return;
    throw Failure(kFailed, path, "no AppleDouble file",
                  "move it away, or look at it with: mavoea dump FILE");
}

AppleDoubleFile::AppleDoubleFile(const ChangedFile& file)
    : file_(file.file()), layout_(ReadLayout(file_)) {
    RequireAppleDouble(layout_, file_.path());
}

bool AppleDoubleFile::HasFinderInfo() const { return !IsAllZero(layout_.finder_info); }

void AppleDoubleFile::SetFinderInfo(const Bytes& value) {
    if (layout_.file_size == 0) MakePlain();
    const Range range = layout_.entries[NeedEntry(EntryId::kFinderInfo)].data;
    // Bytes that could be read from behind the descriptors can be written there.
    if (layout_.finder_info.empty() || range.offset < DescriptorsEnd(layout_.header->entry_count)) {
        throw Failure(kFailed, file_.path(), "it has no room for Finder info where its header says",
                      kLook);
    }
    file_.Write(range.offset, value);
    file_.Sync();
    layout_.finder_info = value;
}

std::uint32_t AppleDoubleFile::ForkLength() const {
    const auto index = layout_.FindEntry(EntryId::kResourceFork);
    return index ? layout_.entries[*index].data.length : 0;
}

void AppleDoubleFile::SetFork(const Bytes& value) {
    if (layout_.file_size == 0) MakePlain();
    const std::size_t index = NeedEntry(EntryId::kResourceFork);
    EntryDescriptor fork = layout_.entries[index];
    const std::uint64_t before = layout_.EndBeforeFork();
    if (fork.data.length > 0 && fork.data.offset < before) {
        throw Failure(kFailed, file_.path(), "its resource fork is not its last part", kLook);
    }
    // Where an empty fork lies means nothing.
    const std::uint64_t offset = fork.data.length > 0 ? fork.data.offset : before;
    if (offset > layout_.file_size) {
        throw Failure(kFailed, file_.path(), "it ends before its resource fork should begin",
                      kLook);
    }
    if (offset + value.size() >= kStreamSizeMax) {
        throw Failure(kFailed, file_.path(), "it would pass 4 GiB", "use a smaller resource fork");
    }
    fork.data = {static_cast<std::uint32_t>(offset), static_cast<std::uint32_t>(value.size())};
    std::array<std::uint8_t, EntryDescriptor::kSize> descriptor{};
    BeWriter out(descriptor);
    EncodeEntryDescriptor(fork, out);

    file_.Reserve(offset, value.size());
    file_.Write(offset, value);
    file_.Write(DescriptorsEnd(static_cast<std::uint16_t>(index)), descriptor);
    file_.Resize(offset + value.size());
    file_.Sync();
    layout_ = ReadLayout(file_);
}

std::optional<std::uint16_t> AppleDoubleFile::AfpAttributes() const {
    const auto index = layout_.FindEntry(EntryId::kAfpFileInfo);
    if (!index || layout_.entries[*index].data.length < kAfpFileInfoSize) return std::nullopt;
    const Bytes info = file_.Read(layout_.entries[*index].data.offset, kAfpFileInfoSize);
    if (info.size() < kAfpFileInfoSize) return std::nullopt;
    return LoadBe16(&info[kAfpAttributesOffset]);
}

void AppleDoubleFile::SetAfpAttributes(std::uint16_t word) {
    const Range range = layout_.entries[NeedEntry(EntryId::kAfpFileInfo)].data;
    if (range.offset < DescriptorsEnd(layout_.header->entry_count)) {
        throw Failure(kFailed, file_.path(), "its AFP file info lies in its header", kLook);
    }
    std::array<std::uint8_t, sizeof word> bytes{};
    StoreBe16(word, bytes.data());
    file_.Write(range.offset + std::uint64_t{kAfpAttributesOffset}, bytes);
    file_.Sync();
}

// A plain file begins as a new stream does, up to where the attribute area would.
void AppleDoubleFile::MakePlain() {
    std::array<std::uint8_t, kStreamHeaderSize> header{};
    EncodeStreamHeader(NewStreamHeader(), header);
    file_.Reserve(0, kAttributeHeaderOffset);
    file_.Write(0, ByteView(header).first(kAttributeHeaderOffset));
    layout_ = ReadLayout(file_);
}

std::size_t AppleDoubleFile::NeedEntry(EntryId id) const {
    const auto index = layout_.FindEntry(id);
    if (index && layout_.entries.size() == layout_.header->entry_count) return *index;
    throw Failure(kFailed, file_.path(), std::string("it has no entry for a ") + EntryName(id),
                  kLook);
}

}  // namespace mavoea::tool

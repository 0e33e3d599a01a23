#include "tools/apple_double_file.h"

#include <algorithm>
#include <array>

#include "tools/messages.h"

namespace mavoea::tool {
namespace {

constexpr const char* kLook = "look at it with: mavoea dump FILE";

}  // namespace

void RequireAppleDouble(const Layout& layout, const std::string& path) {
    if (layout.file_size == 0 || layout.IsAppleDouble()) return;
    throw Failure(kFailed, path, "no AppleDouble file",
                  "move it away, or look at it with: mavoea dump FILE");
}

std::unique_ptr<AppleDoubleFile> AppleDoubleFile::Open(const Sidecar& sidecar, Access access) {
    std::optional<File> file = sidecar.Open(access);
    if (!file) return nullptr;
    return std::unique_ptr<AppleDoubleFile>(new AppleDoubleFile(std::move(*file), access));
}

AppleDoubleFile::AppleDoubleFile(File file, Access access)
    : file_(std::move(file)),
      lock_(file_, access),
      remove_if_failed_(file_, access),
      layout_(ReadLayout(file_)) {
    RequireAppleDouble(layout_, path());
}

std::optional<Bytes> AppleDoubleFile::FinderInfo() const {
    const Bytes& bytes = layout_.finder_info;
    const bool any = std::any_of(bytes.begin(), bytes.end(), [](auto byte) { return byte != 0; });
    return any ? std::optional(bytes) : std::nullopt;
}

void AppleDoubleFile::SetFinderInfo(const Bytes& value) {
    if (layout_.file_size == 0) MakePlain();
    const Range range = layout_.entries[NeedEntry(EntryId::kFinderInfo)].data;
    // Bytes that could be read from behind the descriptors can be written there.
    if (layout_.finder_info.empty() || range.offset < DescriptorsEnd(layout_.header->entry_count)) {
        throw Failure(kFailed, path(), "it has no room for Finder info where its header says",
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

std::optional<Bytes> AppleDoubleFile::Fork() const {
    if (ForkLength() == 0) return std::nullopt;
    const Range range = layout_.entries[*layout_.FindEntry(EntryId::kResourceFork)].data;
    Bytes bytes = file_.Read(range.offset, range.length);
    if (bytes.size() != range.length) {
        throw Failure(kFailed, path(), "its resource fork passes the end of the file", kLook);
    }
    return bytes;
}

void AppleDoubleFile::SetFork(const Bytes& value) {
    if (layout_.file_size == 0) MakePlain();
    const std::size_t index = NeedEntry(EntryId::kResourceFork);
    EntryDescriptor fork = layout_.entries[index];
    const std::uint64_t before = layout_.EndBeforeFork();
    if (fork.data.length > 0 && fork.data.offset < before) {
        throw Failure(kFailed, path(), "its resource fork is not its last part", kLook);
    }
    // Where an empty fork lies means nothing.
    const std::uint64_t offset = fork.data.length > 0 ? fork.data.offset : before;
    if (offset > layout_.file_size) {
        throw Failure(kFailed, path(), "it ends before its resource fork should begin", kLook);
    }
    if (offset + value.size() >= kStreamSizeMax) {
        throw Failure(kFailed, path(), "it would pass 4 GiB", "use a smaller resource fork");
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
    throw Failure(kFailed, path(), std::string("it has no entry for a ") + EntryName(id), kLook);
}

}  // namespace mavoea::tool

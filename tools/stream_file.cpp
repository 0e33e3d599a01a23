#include "tools/stream_file.h"

#include <fcntl.h>

#include <algorithm>
#include <limits>

#include "tools/apple_double_file.h"
#include "tools/layout.h"
#include "tools/messages.h"

namespace mavoea::tool {

std::unique_ptr<StreamFile> StreamFile::Open(const Sidecar& sidecar, Access access) {
    std::optional<File> file = sidecar.Open(access);
    if (!file) return nullptr;
    return std::unique_ptr<StreamFile>(new StreamFile(std::move(*file), access));
}

StreamFile::StreamFile(File file, Access access)
    : file_(std::move(file)), handle_(OpenHandle(file_, access)), remove_if_failed_(file_, access) {
    RequireAppleDouble(ReadLayout(file_), file_.path());
}

StreamFile::Handle StreamFile::OpenHandle(const File& file, Access access) {
    const ErrorMark mark;
    Handle handle(MAVOEASOpen(file.fd(), access == Access::kRead ? F_RDLCK : F_WRLCK));
    if (handle) return handle;
    const LibraryError error = mark.Get();
    if (error.code != MAVOEA_ERR_LOCK) RequireAppleDouble(ReadLayout(file), file.path());
    throw LibraryFailure(file.path(), error);
}

std::vector<StreamFile::Attribute> StreamFile::List() const {
    const std::uint16_t count = DecodeStreamHeader(handle_->header).attributes.count;
    std::vector<Attribute> attributes;
    for (std::uint16_t i = 0; i < count; ++i) {
        attributes.push_back({handle_->entries[i].name, handle_->entries[i].length});
    }
    return attributes;
}

std::optional<std::uint32_t> StreamFile::SizeOf(const std::string& name) const {
    const ErrorMark mark;
    const int index = MAVOEASSearch(handle_.get(), name.c_str());
    if (index >= 0) return handle_->entries[index].length;
    const LibraryError error = mark.Get();
    if (error.code == MAVOEA_ERR_NO_ATTRIBUTE) return std::nullopt;
    throw LibraryFailure(file_.path(), error);
}

std::optional<Bytes> StreamFile::Get(const std::string& name) const {
    const std::optional<std::uint32_t> size = SizeOf(name);
    if (!size || *size == 0) return size ? std::optional<Bytes>(Bytes()) : std::nullopt;
    // A damaged length makes nothing large.
    if (*size > file_.Size()) {
        throw LibraryFailure(file_.path(), {MAVOEA_ERR_READ, 0});
    }
    Bytes value(*size);
    const ErrorMark mark;
    const int got = MAVOEASRead(handle_.get(), name.c_str(), value.data(), *size, 0);
    if (got < 0) throw LibraryFailure(file_.path(), mark.Get());
    value.resize(static_cast<std::size_t>(got));
    return value;
}

void StreamFile::Set(const std::string& name, const Bytes& value) const {
    if (value.size() > std::size_t{std::numeric_limits<int>::max()}) {
        throw Failure(kFailed, file_.path(), "the value has 2 GiB or more", "use a smaller value");
    }
    RefuseToLoseEntries();
    // A write never makes a value shorter.
    if (const auto old_size = SizeOf(name); old_size && *old_size > value.size()) Remove(name);
    const ErrorMark mark;
    if (MAVOEASWrite(handle_.get(), name.c_str(), value.data(), static_cast<unsigned>(value.size()),
                     0, EAS_WRITE_OVERWRITE) < 0) {
        throw LibraryFailure(file_.path(), mark.Get());
    }
}

bool StreamFile::Remove(const std::string& name) const {
    if (!SizeOf(name)) return false;
    RefuseToLoseEntries();
    const ErrorMark mark;
    if (MAVOEASRemove(handle_.get(), name.c_str()) != 0) {
        throw LibraryFailure(file_.path(), mark.Get());
    }
    return true;
}

// A rewrite keeps Finder info, attributes and resource fork. Programs on other systems put more
// into their AppleDouble files.
void StreamFile::RefuseToLoseEntries() const {
    const Layout layout = ReadLayout(file_);
    for (const EntryDescriptor& entry : layout.entries) {
        const bool kept = entry.id == EntryId::kFinderInfo || entry.id == EntryId::kResourceFork;
        if (kept || entry.id == EntryId::kNone || entry.data.length == 0) continue;
        throw Failure(kFailed, file_.path(),
                      std::string("a change of its attributes would lose its entry \"") +
                          EntryName(entry.id) + "\"",
                      "move the file away if that is no loss");
    }
}

}  // namespace mavoea::tool

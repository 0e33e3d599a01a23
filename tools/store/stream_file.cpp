#include "tools/store/stream_file.h"

#include <fcntl.h>

#include <limits>

#include "stream/internal.h"
#include "tools/say/messages.h"
#include "tools/store/apple_double_file.h"
#include "tools/store/layout.h"

namespace mavoea::tool {

StreamFile::StreamFile(const ChangedFile& file)
    : file_(file.file()), handle_(OpenHandle(file.file())) {
    RequireAppleDouble(ReadLayout(file_), file_.path());
}

StreamFile::Handle StreamFile::OpenHandle(const File& file) {
    const ErrorMark mark;
    Handle handle(MAVOEASOpen(file.fd(), F_WRLCK));
    if (handle) return handle;
    const LibraryError error = mark.Get();
    if (error.code != MAVOEA_ERR_LOCK) RequireAppleDouble(ReadLayout(file), file.path());
    throw LibraryFailure(file.path(), error);
}

std::optional<std::uint32_t> StreamFile::SizeOf(const std::string& name) const {
    const ErrorMark mark;
    const int index = MAVOEASSearch(handle_.get(), name.c_str());
    if (index >= 0) return handle_->entries[index].length;
    const LibraryError error = mark.Get();
    if (error.code == MAVOEA_ERR_NO_ATTRIBUTE) return std::nullopt;
    throw LibraryFailure(file_.path(), error);
}

void StreamFile::Set(const std::string& name, const Bytes& value) const {
    if (value.size() > std::size_t{std::numeric_limits<int>::max()}) {
        throw Failure(kFailed, file_.path(), "the value has 2 GiB or more", "use a smaller value");
    }
    RefuseToLoseEntries();
    const auto old_size = SizeOf(name);
    const ErrorMark mark;
    // A write never makes a value shorter.
    const int result =
        old_size && *old_size > value.size()
            ? EASReplace(handle_.get(), name.c_str(), value)
            : MAVOEASWrite(handle_.get(), name.c_str(), value.data(),
                           static_cast<unsigned>(value.size()), 0, EAS_WRITE_OVERWRITE);
    if (result < 0) throw LibraryFailure(file_.path(), mark.Get());
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

// Finder info and resource fork of a metadata file, read and written in place through the
// descriptors that the file has. Nothing else in it changes.
#ifndef MAVOEA_TOOLS_APPLE_DOUBLE_FILE_H_
#define MAVOEA_TOOLS_APPLE_DOUBLE_FILE_H_

#include <memory>
#include <optional>

#include "tools/layout.h"
#include "tools/sidecar.h"

namespace mavoea::tool {

// Open and locked until the end of its scope. All members throw Failure.
class AppleDoubleFile {
 public:
    // Null when there is no such file. With Access::kCreate, a missing or empty one becomes a plain
    // file of two entries as soon as something is set.
    static std::unique_ptr<AppleDoubleFile> Open(const Sidecar& sidecar, Access access);

    const std::string& path() const { return file_.path(); }

    // 32 bytes; none when they are all zero, which means that there is no Finder info.
    std::optional<Bytes> FinderInfo() const;
    void SetFinderInfo(const Bytes& value);
    void ClearFinderInfo() { SetFinderInfo(Bytes(kFinderInfoSize)); }

    // Its length in bytes, 0 when there is none, whether or not all of it is in the file.
    std::uint32_t ForkLength() const;
    std::optional<Bytes> Fork() const;

    // Refused, before anything has changed, when the fork is not the file's last part.
    void SetFork(const Bytes& value);

 private:
    AppleDoubleFile(File file, Access access);

    void MakePlain();
    std::size_t NeedEntry(EntryId id) const;

    File file_;
    FileLock lock_;
    RemoveIfFailed remove_if_failed_;
    Layout layout_;
};

// A message for files that hold something else.
void RequireAppleDouble(const Layout& layout, const std::string& path);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_APPLE_DOUBLE_FILE_H_

// Changing Finder info, resource fork and AFP word of a metadata file, in place through the
// descriptors that the file has. Nothing else in it changes.
#ifndef MAVOEA_TOOLS_STORE_APPLE_DOUBLE_FILE_H_
#define MAVOEA_TOOLS_STORE_APPLE_DOUBLE_FILE_H_

#include <optional>
#include <string>

#include "tools/store/changed_file.h"
#include "tools/store/layout.h"

namespace mavoea::tool {

// All members throw Failure. An empty file becomes a plain one of two entries as soon as something
// is set.
class AppleDoubleFile {
 public:
    explicit AppleDoubleFile(const ChangedFile& file);

    // Whether it has any that is not all zero.
    bool HasFinderInfo() const;
    void SetFinderInfo(const Bytes& value);

    // Its length in bytes, 0 when there is none, whether or not all of it is in the file.
    std::uint32_t ForkLength() const;

    // Refused, before anything has changed, when the fork is not the file's last part.
    void SetFork(const Bytes& value);

    // None when the file has none.
    std::optional<std::uint16_t> AfpAttributes() const;
    void SetAfpAttributes(std::uint16_t word);

 private:
    void MakePlain();
    std::size_t NeedEntry(EntryId id) const;

    const File& file_;
    Layout layout_;
};

// A message for files that hold something else.
void RequireAppleDouble(const Layout& layout, const std::string& path);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_APPLE_DOUBLE_FILE_H_

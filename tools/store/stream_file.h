// Changing the named attributes of a metadata file, through the library's stream functions.
#ifndef MAVOEA_TOOLS_STORE_STREAM_FILE_H_
#define MAVOEA_TOOLS_STORE_STREAM_FILE_H_

#include <memory>
#include <optional>
#include <string>

#include "include/mavoea.h"
#include "tools/store/changed_file.h"

namespace mavoea::tool {

// All members throw Failure.
class StreamFile {
 public:
    explicit StreamFile(const ChangedFile& file);

    void Set(const std::string& name, const Bytes& value) const;
    bool Remove(const std::string& name) const;  // false: there was none

 private:
    struct CloseHandle {
        void operator()(EASHandle* handle) const { (void)MAVOEASClose(handle); }
    };
    using Handle = std::unique_ptr<EASHandle, CloseHandle>;

    static Handle OpenHandle(const File& file);
    std::optional<std::uint32_t> SizeOf(const std::string& name) const;
    void RefuseToLoseEntries() const;

    const File& file_;
    Handle handle_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_STREAM_FILE_H_

// The named attributes of a metadata file, through the library's stream functions.
#ifndef MAVOEA_TOOLS_STREAM_FILE_H_
#define MAVOEA_TOOLS_STREAM_FILE_H_

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tools/sidecar.h"

namespace mavoea::tool {

// Open and locked until the end of its scope. All members throw Failure.
class StreamFile {
 public:
    // Null when there is no such file and it was not to be made.
    static std::unique_ptr<StreamFile> Open(const Sidecar& sidecar, Access access);

    struct Attribute {
        std::string name;
        std::uint32_t size = 0;
    };
    std::vector<Attribute> List() const;  // in the stream's order

    std::optional<Bytes> Get(const std::string& name) const;
    void Set(const std::string& name, const Bytes& value) const;
    bool Remove(const std::string& name) const;  // false: there was none

 private:
    struct CloseHandle {
        void operator()(EASHandle* handle) const { (void)MAVOEASClose(handle); }
    };
    using Handle = std::unique_ptr<EASHandle, CloseHandle>;

    StreamFile(File file, Access access);

    static Handle OpenHandle(const File& file, Access access);
    std::optional<std::uint32_t> SizeOf(const std::string& name) const;
    void RefuseToLoseEntries() const;

    File file_;
    Handle handle_;
    RemoveIfFailed remove_if_failed_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STREAM_FILE_H_

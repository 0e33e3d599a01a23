// Gives a stream one attribute after the other.
#ifndef MAVOEA_STREAM_ATTRIBUTE_WRITER_H_
#define MAVOEA_STREAM_ATTRIBUTE_WRITER_H_

#include <cstdint>

#include "include/mavoea.h"

namespace mavoea {

// After a write that failed, the memory of a handle may be ahead of the file and must not be
// written from: the next write opens the stream anew, under the same lock. Should that fail,
// nothing more is written: the lock may be gone. errno stays on the way out.
class AttributeWriter {
 public:
    // On the stream on fd, which stays the caller's, under a write lock. Empty after a code of
    // MAVOEASOpen().
    explicit AttributeWriter(int fd);
    ~AttributeWriter() { Close(); }
    AttributeWriter(const AttributeWriter&) = delete;
    AttributeWriter& operator=(const AttributeWriter&) = delete;

    explicit operator bool() const { return stream_ != nullptr; }

    // Creates or replaces the attribute. Whether it is on disk; not: after a code of
    // MAVOEASWrite(), or of MAVOEASOpen() when it is opened anew.
    bool Write(const char* name, const void* value, std::uint32_t size);

    // The stream as it was opened, with all that has been written since.
    EASHandle* stream() const { return stream_; }

 private:
    void Close();
    void OpenAnew();

    int fd_;
    EASHandle* stream_;
    bool stale_ = false;  // a write has failed
};

}  // namespace mavoea

#endif  // MAVOEA_STREAM_ATTRIBUTE_WRITER_H_

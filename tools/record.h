// An object's netatalk record: reading it, changing it in place, storing it.
#ifndef MAVOEA_TOOLS_RECORD_H_
#define MAVOEA_TOOLS_RECORD_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "tools/text.h"
#include "tools/volume.h"

namespace mavoea::tool {

enum class RecordPlace { kAttribute, kResourceFile };

// A valid record. What is changed is stored by Flush() only. All members throw Failure.
class Record {
 public:
    // None when the object has none there; a Failure when what is there is damaged.
    static std::optional<Record> Read(const std::string& object, RecordPlace place);

    // 32 bytes; none when they are all zero, or not in the record.
    std::optional<Bytes> FinderInfo() const;
    // A Failure when the record has no room for them.
    void SetFinderInfo(const Bytes& value);

    // The AFP attribute word, 0 when the record has none.
    std::uint16_t AfpAttributes() const;
    void ClearAfpAttributes(std::uint16_t bits);

    void Flush() const;

 private:
    Record(std::string object, RecordPlace place);

    // `size` bytes of an entry; empty when the entry is absent, shorter, or not in the record.
    ByteSpan Entry(Slot slot, std::size_t size);
    ByteView Entry(Slot slot, std::size_t size) const;

    std::string object_;
    RecordPlace place_;
    EAAdouble record_{};
};

// A record as it is stored, whatever it holds.
struct StoredRecord {
    std::string file;  // that holds it
    Bytes block;
};

// None when there is nothing, or only a resource file that is too short to hold one. Nothing is
// converted on the way. Throws Failure.
std::optional<StoredRecord> ReadStoredRecord(const Object& object, RecordPlace place);

// Storing a record in a resource file keeps a descriptor each time. Around such a call, this closes
// the one that it kept.
class KeptDescriptor {
 public:
    KeptDescriptor();
    ~KeptDescriptor();
    KeptDescriptor(const KeptDescriptor&) = delete;
    KeptDescriptor& operator=(const KeptDescriptor&) = delete;

 private:
    int next_;  // the number that the next descriptor to stay open gets
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_RECORD_H_

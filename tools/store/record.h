// An object's netatalk record in its attribute: changing it in place. And records as they are
// stored, to be looked at.
#ifndef MAVOEA_TOOLS_STORE_RECORD_H_
#define MAVOEA_TOOLS_STORE_RECORD_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "tools/place/volume.h"
#include "tools/say/text.h"

namespace mavoea::tool {

enum class RecordPlace { kAttribute, kResourceFile };

// A valid record. What is changed is stored by Store() only. All members throw Failure.
class Record {
 public:
    // None when the object has none; a Failure when what is there is damaged.
    static std::optional<Record> Read(const Inode& object);

    bool HasFinderInfo() const;
    // A Failure when the record has no room for them.
    void SetFinderInfo(const Bytes& value);

    // The AFP attribute word; none when the record has none.
    std::optional<std::uint16_t> AfpAttributes() const;
    void SetAfpAttributes(std::uint16_t word);

    void Store(const Inode& object) const;

 private:
    // `size` bytes of an entry; empty when the entry is absent, shorter, or not in the record.
    ByteSpan Entry(Slot slot, std::size_t size);
    ByteView Entry(Slot slot, std::size_t size) const;

    std::string path_;
    EAAdouble record_{};
};

// Replaces an object's record by a fresh one with that Finder info.
void StoreFreshRecord(const Inode& object, const Bytes& finder_info);

// The time at which the metadata of an object on a file-EA volume changed: now.
void StampFlushTime(const Inode& object);

// A record as it is stored, whatever it holds.
struct StoredRecord {
    std::string file;       // that holds it
    std::string attribute;  // of that file; empty for the head of a resource file
    Bytes block;
};

// None when there is nothing, or only a resource file that is too short to hold one. Throws
// Failure.
std::optional<StoredRecord> ReadStoredRecord(const Object& object, RecordPlace place);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_RECORD_H_

// Extended attributes of a file: which of them are its metadata when it goes to another place, and
// which are its own.
#ifndef MAVOEA_TOOLS_TRANSFER_OWN_ATTRIBUTES_H_
#define MAVOEA_TOOLS_TRANSFER_OWN_ATTRIBUTES_H_

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// Whether an attribute of the object travels as its metadata, and not with its mode and owner.
// Those in which Samba keeps marks and more go as they are; the marks are set after that.
bool TravelsAsMetadata(const std::string& attribute, const Object& from, const Object& to);

// Whether what is known of an object, or some of it, is in the object itself, and one for all its
// names; the fork may still be beside each of them.
bool KeepsInInode(const Object& object);
bool KeepsForkInInode(const Object& object);

// Those of `source`, the object `from`, that are none of its metadata on the way to `to`. They are
// listed when somebody asks. All members throw Failure.
class OwnAttributes {
 public:
    OwnAttributes(Object from, std::shared_ptr<const Inode> source, Object to)
        : from_(std::move(from)), source_(std::move(source)), to_(std::move(to)) {}

    const std::vector<std::string>& Names() const;
    bool Has(const std::string& name) const;

    // Adds those whose names some of the metadata has there, unless both say the same.
    void AddWrittenOver(const Metadata& fitting, std::vector<Missing>* missing) const;
    // Adds those for which an object that would be there has no room beside each other.
    void AddWithoutRoom(const Inode& foreseen, std::vector<Missing>* missing) const;
    // Whether one of them is that attribute of a copy there.
    bool HasAs(const Metadata::Attribute& there) const;

 private:
    // How an attribute of that name is kept there.
    std::optional<Spelling> SpellingThere(const std::string& name) const;

    Object from_;
    std::shared_ptr<const Inode> source_;
    Object to_;
    mutable std::optional<std::vector<std::string>> names_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_OWN_ATTRIBUTES_H_

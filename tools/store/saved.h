// What is known of an object as extended attributes in a text, and back. docs/saving.md has the
// names.
#ifndef MAVOEA_TOOLS_STORE_SAVED_H_
#define MAVOEA_TOOLS_STORE_SAVED_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "format/attribute_text.h"
#include "tools/place/attribute_source.h"
#include "tools/place/dialect.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// The most bytes of a value, and of all values of an object, that a text holds: who reads one has
// an object in memory at a time.
inline constexpr std::uint64_t kSavedValueMax = std::uint64_t{64} << 20;
inline constexpr std::uint64_t kSavedObjectMax = std::uint64_t{256} << 20;

struct SavedItem {
    std::string item;       // how messages call it
    std::string attribute;  // its name in the text
    Content value;
};

// All of it, each under a name that means it and nothing else. What has no such name, or cannot be
// read, is added to *missing.
std::vector<SavedItem> SavedItems(const Metadata& metadata, std::vector<Missing>* missing);

// The attributes that a text has of an object.
class SavedAttributes final : public AttributeSource {
 public:
    // `path`: of the text and the line, for people.
    explicit SavedAttributes(std::string path) : path_(std::move(path)) {}

    // Of two of one name the later is meant.
    void Set(const std::string& name, Bytes value, TextEncoding encoding);

    const std::string& path() const override { return path_; }
    // In the order in which they stand in the text.
    std::vector<std::string> AttributeNames() const override;
    std::optional<Bytes> Attribute(const std::string& name) const override;

    // Takes it out.
    std::optional<Bytes> Take(const std::string& name);

    // Puts back the NUL that getfattr leaves out at the end of texts, where something must have had
    // one.
    void RestoreNuls(const Dialect& dialect);

 private:
    struct Value {
        Bytes bytes;
        TextEncoding encoding;
        std::size_t position;  // among those that have been set
    };

    std::string path_;
    std::map<std::string, Value> values_;
    std::size_t next_position_ = 0;
};

// What they say of the object.
struct ReadBack {
    Metadata metadata;                // what is damaged or means nothing is among the problems
    std::vector<std::string> others;  // attributes that are nobody's metadata
};

// `type`: of the volume that the text was made of, where its attributes mean something else than by
// themselves; -1 where not.
ReadBack ReadSaved(SavedAttributes attributes, int type);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_SAVED_H_

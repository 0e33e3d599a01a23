// Extended attributes, wherever they are read from: an object, or a text that has been made of
// one's.
#ifndef MAVOEA_TOOLS_PLACE_ATTRIBUTE_SOURCE_H_
#define MAVOEA_TOOLS_PLACE_ATTRIBUTE_SOURCE_H_

#include <optional>
#include <string>
#include <vector>

#include "tools/say/text.h"

namespace mavoea::tool {

// All members throw Failure.
class AttributeSource {
 public:
    virtual ~AttributeSource() = default;

    virtual const std::string& path() const = 0;  // for people
    virtual std::vector<std::string> AttributeNames() const = 0;
    virtual std::optional<Bytes> Attribute(const std::string& name) const = 0;

 protected:
    AttributeSource() = default;
    AttributeSource(const AttributeSource&) = default;
    AttributeSource& operator=(const AttributeSource&) = default;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_ATTRIBUTE_SOURCE_H_

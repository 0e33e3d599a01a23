// Property lists, in which Macs keep values of attributes: comments, tags and the like. Debian's
// libplist reads and writes them. It takes lists of any depth, and such as name one part again and
// again, until the stack or memory is used up: what it is given has been looked through.
#ifndef MAVOEA_TOOLS_SHOW_PROPERTY_LIST_H_
#define MAVOEA_TOOLS_SHOW_PROPERTY_LIST_H_

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tools/say/json.h"
#include "tools/say/text.h"

namespace mavoea::tool {

inline constexpr std::size_t kPropertyListSizeMax = std::size_t{1} << 16;

class PropertyList {
 public:
    // A binary list, or an XML one; none of anything else, with the reason: what is too long, too
    // deep or too much, what is damaged, and what libplist would change (NULs in texts, dates
    // beyond 2069, integers of 16 bytes).
    static std::optional<PropertyList> Parse(ByteView bytes, std::string* reason);

    // A text, and an array of nothing but texts; none of anything else. They are what the list
    // holds, whether or not that is UTF-8.
    std::optional<std::string> Text() const;
    std::optional<std::vector<std::string>> Texts() const;

    // Data is a text of hexadecimal digits, a date one in ISO 8601; integers have signs.
    Json AsJson() const;

 private:
    struct Free {
        void operator()(void* node) const;
    };

    explicit PropertyList(void* root) : root_(root) {}

    std::unique_ptr<void, Free> root_;
};

// Binary lists of texts, which are UTF-8 without NULs.
Bytes EncodePropertyList(const std::string& text);
Bytes EncodePropertyList(const std::vector<std::string>& texts);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_PROPERTY_LIST_H_

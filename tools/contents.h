// All that an AppleDouble file holds that an object can be given.
#ifndef MAVOEA_TOOLS_CONTENTS_H_
#define MAVOEA_TOOLS_CONTENTS_H_

#include <optional>
#include <string>
#include <vector>

#include "tools/layout.h"

namespace mavoea::tool {

struct Contents {
    struct Attribute {
        std::string name;
        Bytes value;
    };
    std::vector<Attribute> attributes;  // in the file's order; of two with one name the last
    std::optional<Bytes> finder_info;   // 32 bytes, not all zero
    std::optional<Bytes> fork;          // not empty, and not the words that stand for none

    // What else is in the file, by name: "file dates", ...
    std::vector<std::string> others;
};

// Whether the fork is the words that stand for none.
bool IsBlankFork(const Bytes& fork);

// Reads the whole file, whose layout that is. Failure when it is no AppleDouble file of version 2,
// or when anything in it lies outside of it.
Contents ReadContents(const File& file, const Layout& layout);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CONTENTS_H_

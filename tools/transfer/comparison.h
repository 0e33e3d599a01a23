// Two objects, on volumes of any kinds: whether they say the same, wherever they keep it.
#ifndef MAVOEA_TOOLS_TRANSFER_COMPARISON_H_
#define MAVOEA_TOOLS_TRANSFER_COMPARISON_H_

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "tools/place/volume.h"
#include "tools/say/json.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"

namespace mavoea::tool {

struct Difference {
    enum class Aspect {
        kObject,     // is there on one side only
        kType,       // a file here, a directory there
        kData,       // of a file
        kTarget,     // of a symbolic link, or of a device
        kAttribute,  // and Finder info, resource fork, locked state
        kEntry,      // of a netatalk record, or of another AppleDouble header
        kService,    // what another service keeps for it
    };
    enum class What { kMissing, kExtra, kDifferent };

    std::string path = {};  // of the first; of the second where that alone is there
    Aspect aspect = Aspect::kObject;
    What what = What::kDifferent;
    std::string name = {};                     // of the attribute or entry
    std::optional<std::uint64_t> offset = {};  // of the first byte that differs, from 0
};

// For people: ""NAME"", "AppleDouble comment", "data"; empty for the object itself.
std::string ItemText(const Difference& difference);
// On one line: "PATH: "NAME": different at byte 5".
std::string DifferenceText(const Difference& difference);
Json DifferenceJson(const Difference& difference);

struct Compared {
    bool data = true;
    // The second is a copy of the first, which may have attributes that every file may have and
    // that are metadata only where the copy is. Otherwise neither comes before the other.
    bool copied = true;
};

struct ComparisonReceiver {
    std::function<void(Difference)> differs;
    std::function<void(const Failure&)> fails;
    std::function<bool()> give_up = [] { return false; };  // asked while data is read
};

// Compares two objects that are there, one aspect after the other, and goes on where one of them
// cannot be read.
void Compare(const Object& first, const Object& second, const Compared& compared,
             const ComparisonReceiver& receiver);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_COMPARISON_H_

// A dry run: all is looked at and decided as it would be, and what would be written is not. Who
// writes asks here, next to the call that does it.
#ifndef MAVOEA_TOOLS_PLACE_DRY_RUN_H_
#define MAVOEA_TOOLS_PLACE_DRY_RUN_H_

#include <optional>
#include <string>

#include "tools/place/directory.h"

namespace mavoea::tool {

// From here on nothing is changed, for the rest of the process.
void BeginDryRun();
bool DryRun();

// What the calls of these names would fail with, as far as that can be known without them: an
// errno, 0 for none.
int WhyNoAttribute(const Inode& inode, const std::string& name, std::size_t size);
int WhyNoMode(const Inode& inode);
int WhyNoNewFile(const Directory& directory);
int WhyNoRemoval(const Place& place);

// What a dry run would have made of the attributes of the object that it has in hand, so that its
// later steps find what they would. Of another object nothing is known any more.
class Rehearsed {
 public:
    // Null when the run is none, or would leave the attribute alone.
    static const std::optional<Bytes>* Find(const Inode& inode, const std::string& name);
    // Without a value it goes.
    // From here on what is there is seen.
    static void Forget();
    static void Note(const Inode& inode, const std::string& name, std::optional<Bytes> value);
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_DRY_RUN_H_

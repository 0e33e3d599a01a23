// Changing one thing of an object's metadata, in place.
#ifndef MAVOEA_TOOLS_STORE_CHANGE_H_
#define MAVOEA_TOOLS_STORE_CHANGE_H_

#include <memory>
#include <string>

#include "tools/place/volume.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// "com.apple.FinderInfo", "com.apple.ResourceFork" and "mavoea.locked" are names like any other.
// What an earlier version kept is not looked at. All members throw Failure.
class Changer {
 public:
    virtual ~Changer() = default;

    virtual void Set(const std::string& name, const Bytes& value) = 0;
    virtual bool Remove(const std::string& name) = 0;  // false: there was none
};

// Finder info of another size than its own is a Failure.
void CheckFinderInfoSize(const std::string& path, const Bytes& value);

// The one for the object's volume. Failure for a volume whose type has none, and where the metadata
// would be another object's as well.
std::unique_ptr<Changer> OpenChanger(const Object& object);

// Sets the Mac locked state; false when that is what it was. Failure when the object is not in that
// state afterwards; what is damaged is told before anything has changed.
bool SetLocked(const Object& object, bool locked);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_CHANGE_H_

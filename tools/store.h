// An object's attributes, wherever its volume keeps them. "com.apple.FinderInfo",
// "com.apple.ResourceFork" and "mavoea.locked" are names like any other.
#ifndef MAVOEA_TOOLS_STORE_H_
#define MAVOEA_TOOLS_STORE_H_

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/messages.h"
#include "tools/text.h"
#include "tools/volume.h"

namespace mavoea::tool {

inline constexpr std::string_view kFinderInfoName = "com.apple.FinderInfo";
inline constexpr std::string_view kResourceForkName = "com.apple.ResourceFork";

// The Mac locked state: "1" or "0". It is in the list of what is locked only, and nowhere in a file
// under this name.
inline constexpr std::string_view kLockedName = "mavoea.locked";

enum class Kind { kAttribute, kFinderInfo, kResourceFork, kLocked };

constexpr Kind KindOf(std::string_view name) {
    if (name == kFinderInfoName) return Kind::kFinderInfo;
    if (name == kResourceForkName) return Kind::kResourceFork;
    if (name == kLockedName) return Kind::kLocked;
    return Kind::kAttribute;
}

struct Attribute {
    std::string name;
    std::uint64_t size = 0;  // of the value, in bytes
    Kind kind = Kind::kAttribute;
    std::string file;  // that holds it
};

// All members throw Failure.
class Store {
 public:
    virtual ~Store() = default;

    virtual std::vector<Attribute> List() = 0;
    virtual std::optional<Bytes> Get(const std::string& name) = 0;
    virtual void Set(const std::string& name, const Bytes& value) = 0;
    virtual bool Remove(const std::string& name) = 0;  // false: there was none
};

// Finder info of another size than its own is a Failure.
void CheckFinderInfoSize(const std::string& path, const Bytes& value);

// These two know nothing of the locked state. Types 0 and 5, and types 1, 2, 3, 6 and 10.
std::unique_ptr<Store> MakeEaFileStore(const Object& object);
// Type 7.
std::unique_ptr<Store> MakeXattrStore(const Object& object);

// The one for the object's volume. Failure for a volume whose type has none.
std::unique_ptr<Store> OpenStore(const Object& object);
Failure NoStore(const Object& object);

// Metadata beside the object takes a directory in which it is.
void RequireParent(const Object& object);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_H_

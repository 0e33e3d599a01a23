#include "tools/place/attribute_room.h"

#include <initializer_list>
#include <string_view>

namespace mavoea::tool {
namespace {

constexpr std::size_t kRecord = 16;  // what an attribute takes beside its name and value

constexpr std::size_t Padded(std::size_t size) { return (size + 3) & ~std::size_t{3}; }

bool IsAcl(std::string_view name) { return name.starts_with("system.posix_acl_"); }

// The kernel keeps a number in place of what a name begins with.
std::size_t NameSize(std::string_view name) {
    if (IsAcl(name)) return 0;
    for (const std::string_view prefix : {"user.", "trusted.", "security."}) {
        if (name.starts_with(prefix)) return name.size() - prefix.size();
    }
    return name.size();
}

// Entries of 8 bytes are kept in 4, but for those of named users and groups.
std::size_t ValueSize(std::string_view name, std::size_t size) {
    return IsAcl(name) && size > 4 ? 4 + (size - 4) / 2 : size;
}

}  // namespace

bool AttributeRoom::Area::Put(const std::string& name, std::size_t size) {
    const auto old = sizes.find(name);
    const std::size_t rest = used - (old == sizes.end() ? 0 : old->second);
    if (size > most - rest) return false;
    used = rest + size;
    sizes[name] = size;
    return true;
}

void AttributeRoom::Area::Remove(const std::string& name) {
    const auto old = sizes.find(name);
    if (old == sizes.end()) return;
    used -= old->second;
    sizes.erase(old);
}

bool AttributeRoom::Put(const std::string& name, std::size_t size) {
    const std::size_t whole = kRecord + Padded(NameSize(name)) + Padded(ValueSize(name, size));
    if (inode_.Put(name, whole)) {
        block_.Remove(name);
        return true;
    }
    if (!block_.Put(name, whole)) return false;
    inode_.Remove(name);
    return true;
}

void AttributeRoom::Remove(const std::string& name) {
    inode_.Remove(name);
    block_.Remove(name);
}

}  // namespace mavoea::tool
